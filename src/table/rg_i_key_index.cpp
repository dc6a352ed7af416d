// SPDX-License-Identifier: MIT
// rg_i_key_index: leads to the row that a walk over all keys would find, for tables without a hash table.
//
// Layer: table. Stands on the layout of rows; the comparison of keys is that of the walks.
// Always holds: for every row of the packed index, its slot is entered under the keys of its committed and its applied
// record. Slots may be entered under other keys besides, from records that have gone: an entry only says where to look,
// and every row that it leads to is compared. So nothing needs to be done when a record goes, or at commit and abort,
// which take back or keep records that were entered when they came. When entries that lead nowhere prevail, the index
// is made anew.
// Locking: the table's. Readers may make the index: one of them does, and publishes it whole.
// Failure: none that a caller sees. Without memory there is no index, and walks are made.
#include "table/rg_i_key_index.h"

#include <algorithm>
#include <atomic>
#include <bit>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "memory/rg_i_large_pages.h"

namespace
{

struct entry_t {
    kt_uint32_t hash;
    kt_uint32_t slot;
    kt_uint32_t next; // number of the next entry of the bucket
};

constexpr kt_uint32_t no_entry       = UINT32_MAX;
constexpr kt_uint32_t fewest_rows    = 32;  // below, a walk is as quick
constexpr kt_uint32_t walks_worth    = 8;   // walks over all rows, whose cost is that of making the index
constexpr kt_uint32_t longest_search = 64;  // entries; many equal keys: the walk soon meets one
constexpr kt_uint32_t spare_entries  = 256; // that may lead nowhere besides as many as there are rows

} // namespace

struct rg_i_key_index_t {
    kt_uint32_t * p_buckets; // first entry of each
    entry_t *     p_entries;
    kt_uint32_t   bucket_mask;
    kt_uint32_t   entry_count;
    kt_uint32_t   entry_capacity;
    kt_uint32_t   top_slot; // no slot above it has a record
    bool          has_nan;  // a key that equals all
};

namespace
{

using index_t = rg_i_key_index_t;

// ---- Hashing: equal keys have equal hashes ----

kt_uint32_t mixed(kt_uint64_t bits)
{
    bits = (bits ^ (bits >> 32)) * 0x9e3779b97f4a7c15ull;
    return static_cast<kt_uint32_t>(bits >> 32);
}

kt_uint32_t hash_of_text(const kt_char_t * p_text)
{
    kt_uint64_t hash = 0xcbf29ce484222325ull;
    for (; *p_text != '\0'; ++p_text)
        hash = (hash ^ static_cast<unsigned char>(*p_text)) * 0x100000001b3ull;
    return mixed(hash);
}

// Both zeros are equal.
kt_uint32_t hash_of_number(double number)
{
    return mixed(std::bit_cast<kt_uint64_t>(number == 0 ? 0.0 : number));
}

// A key as the walks compare it; NULL text stands for the empty one.
kt_uint32_t hash_of(kt_data_type_t type, const kt_value_t & key, const kt_char_t * p_text)
{
    switch (type) {
    case KT_INT32:
    case KT_UINT32:
        return mixed(key.val_uint32);
    case KT_INT64:
    case KT_UINT64:
        return mixed(key.val_uint64);
    case KT_FLOAT32:
        return hash_of_number(static_cast<double>(key.val_float32));
    case KT_FLOAT64:
        return hash_of_number(key.val_float64);
    case KT_CHAR_PTR:
        return hash_of_text(p_text != nullptr ? p_text : "");
    default:
        return 0; // equal to nothing
    }
}

bool is_nan(kt_data_type_t type, const kt_value_t & key)
{
    return (type == KT_FLOAT32 && std::isnan(key.val_float32)) || (type == KT_FLOAT64 && std::isnan(key.val_float64));
}

struct record_key_t {
    bool        comparable; // a damaged key equals nothing
    bool        nan;
    kt_uint32_t hash;
};

record_key_t key_of_record(const rg_i_table_t * p_table, kt_char_ptr_t p_record)
{
    const kt_data_type_t type  = p_table->p_columns[0].type;
    const kt_char_ptr_t  p_key = rg_i_row_key(p_table, p_record);
    kt_value_t           key{};
    if (p_key == nullptr)
        return {};
    if (rg_i_type_is_indirect(type))
        return {true, false, hash_of(type, key, p_key)};
    std::memcpy(&key, p_key, sizeof key);
    return {true, is_nan(type, key), hash_of(type, key, nullptr)};
}

bool record_has_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record, const kt_value_t & key)
{
    return rg_i_compare_values_within(&key, rg_i_row_slot(p_record, 0), p_table->p_columns[0].type,
                                      rg_i_row_indirect_data(p_record, p_table->total_columns),
                                      rg_i_row_indirect_length(p_table, p_record)) == 0;
}

// ---- Entries ----

void free_index(index_t * p_index)
{
    if (p_index == nullptr)
        return;
    std::free(p_index->p_buckets);
    std::free(p_index->p_entries);
    std::free(p_index);
}

void link_entry(index_t * p_index, kt_uint32_t number)
{
    entry_t &     entry  = p_index->p_entries[number];
    kt_uint32_t & bucket = p_index->p_buckets[entry.hash & p_index->bucket_mask];
    entry.next           = bucket;
    bucket               = number;
}

// Room for so many entries, and as many buckets or more, with the entries there are.
[[nodiscard]] bool make_room(index_t * p_index, kt_uint32_t entries)
{
    const kt_uint32_t buckets   = std::bit_ceil(entries);
    void * const      p_buckets = std::malloc(buckets * sizeof(kt_uint32_t));
    void * const      p_entries = std::realloc(p_index->p_entries, entries * sizeof(entry_t));
    if (p_entries != nullptr)
        p_index->p_entries = static_cast<entry_t *>(p_entries);
    if (p_buckets == nullptr || p_entries == nullptr) {
        std::free(p_buckets);
        return false;
    }
    rg_i_prefer_large_pages(p_entries, entries * sizeof(entry_t));
    rg_i_prefer_large_pages(p_buckets, buckets * sizeof(kt_uint32_t));
    std::free(p_index->p_buckets);
    p_index->p_buckets      = static_cast<kt_uint32_t *>(p_buckets);
    p_index->bucket_mask    = buckets - 1;
    p_index->entry_capacity = entries;
    std::fill_n(p_index->p_buckets, buckets, no_entry);
    for (kt_uint32_t number = 0; number < p_index->entry_count; ++number)
        link_entry(p_index, number);
    return true;
}

// False: no memory.
[[nodiscard]] bool enter(index_t * p_index, const record_key_t & key, kt_uint32_t slot)
{
    p_index->top_slot = std::max(p_index->top_slot, slot);
    if (!key.comparable)
        return true;
    p_index->has_nan = p_index->has_nan || key.nan;
    if (p_index->entry_count == p_index->entry_capacity &&
        (p_index->entry_capacity > UINT32_MAX / 4 || !make_room(p_index, 2 * p_index->entry_capacity)))
        return false;
    p_index->p_entries[p_index->entry_count] = {key.hash, slot, no_entry};
    link_entry(p_index, p_index->entry_count++);
    return true;
}

// Calls look(slot) for the slots entered under the hash until it returns true. False: too many, not all were looked at.
template <class Look> [[nodiscard]] bool for_each_slot(const index_t * p_index, kt_uint32_t hash, Look && look)
{
    kt_uint32_t searched = 0;
    for (kt_uint32_t number = p_index->p_buckets[hash & p_index->bucket_mask]; number != no_entry;
         number             = p_index->p_entries[number].next) {
        const entry_t & entry = p_index->p_entries[number];
        if (++searched > longest_search)
            return false;
        if (entry.hash == hash && look(entry.slot))
            return true;
    }
    return true;
}

// ---- Making ----

// Whether both walks see each row once, where its slot says. A table that was refreshed while it was open keeps a packed
// index that may not fit its rows, and the walks go by it as it is.
[[nodiscard]] bool walks_are_regular(const rg_i_table_t * p_table, kt_uint32_t uncounted_rows)
{
    for (kt_uint32_t i = 0; i < p_table->total_applied_rows; ++i)
        if (p_table->p_rows_fixed_index[p_table->p_rows_packed_index[i]].packed_index != i)
            return false;
    kt_uint32_t live = 0;
    for (kt_uint32_t slot = 0; slot < p_table->maximum_rows; ++slot)
        live += p_table->p_rows_fixed_index[slot].p_applied != nullptr ? 1 : 0;
    return live == p_table->total_applied_rows - p_table->applied_deletions + uncounted_rows;
}

[[nodiscard]] bool enter_row(const rg_i_table_t * p_table, index_t * p_index, kt_uint32_t slot)
{
    const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[slot];
    if (entry.p_committed != nullptr && !enter(p_index, key_of_record(p_table, entry.p_committed), slot))
        return false;
    return entry.p_applied == nullptr || entry.p_applied == entry.p_committed ||
           enter(p_index, key_of_record(p_table, entry.p_applied), slot);
}

[[nodiscard]] index_t * make_index(const rg_i_table_t * p_table, kt_uint32_t uncounted_rows)
{
    if (!walks_are_regular(p_table, uncounted_rows))
        return nullptr;
    auto * const p_index = static_cast<index_t *>(std::calloc(1, sizeof(index_t)));
    if (p_index == nullptr)
        return nullptr;
    bool made =
        p_table->total_applied_rows < UINT32_MAX / 4 && make_room(p_index, p_table->total_applied_rows + spare_entries);
    for (kt_uint32_t i = 0; made && i < p_table->total_applied_rows; ++i)
        made = enter_row(p_table, p_index, p_table->p_rows_packed_index[i]);
    if (made)
        return p_index;
    free_index(p_index);
    return nullptr;
}

index_t * current_index(const rg_i_table_t * p_table)
{
    return std::atomic_ref(const_cast<rg_i_table_t *>(p_table)->p_key_index).load(std::memory_order_acquire);
}

// Enters a record's key. An index that can't take it, or is mostly about records that have gone, goes; the next walk
// makes it anew.
void enter_or_renew(rg_i_table_t * p_table, const record_key_t & key, kt_uint32_t slot)
{
    index_t * const p_index = p_table->p_key_index;
    // A slot that gets a key again, as rows come and go, needn't be entered again.
    bool entered = false;
    (void)for_each_slot(p_index, key.hash, [&](kt_uint32_t other) { return entered = other == slot; });
    if (entered && key.comparable && !key.nan) {
        p_index->top_slot = std::max(p_index->top_slot, slot);
        return;
    }
    const bool stale = p_index->entry_count / 2 > p_table->total_applied_rows + spare_entries;
    if (!stale && enter(p_index, key, slot))
        return;
    rg_i_key_index_drop(p_table);
    p_table->key_walk_rows = UINT64_MAX / 2;
}

// ---- Finding ----

// Whether a row lies above the slot. What is free at the top needn't be looked at again; a row whose deletion is
// pending may come back.
[[nodiscard]] bool live_row_above(const rg_i_table_t * p_table, index_t * p_index, kt_uint32_t slot)
{
    bool only_free_above = true;
    for (kt_uint32_t above = p_index->top_slot; above > slot; --above) {
        const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[above];
        if (entry.p_applied != nullptr)
            return true;
        only_free_above = only_free_above && entry.p_committed == nullptr;
        if (only_free_above)
            p_index->top_slot = above - 1;
    }
    return false;
}

} // namespace

rg_i_key_answer rg_i_key_index_find(const rg_i_table_t * p_table, const kt_value_t & key,
                                    kt_uint32_t * p_fixed_row_index)
{
    const index_t * const p_index = current_index(p_table);
    const kt_data_type_t  type    = p_table->p_columns[0].type;
    if (p_index == nullptr || p_index->has_nan || is_nan(type, key))
        return rg_i_key_answer::unknown;

    kt_uint32_t first_packed = UINT32_MAX;
    const bool  searched_all = for_each_slot(p_index, hash_of(type, key, key.ptr_char), [&](kt_uint32_t slot) {
        const rg_i_index_entry_t & entry    = p_table->p_rows_fixed_index[slot];
        const kt_char_ptr_t        p_record = entry.p_committed != nullptr ? entry.p_committed : entry.p_applied;
        if (p_record != nullptr && entry.packed_index < first_packed && record_has_key(p_table, p_record, key)) {
            first_packed       = entry.packed_index;
            *p_fixed_row_index = slot;
        }
        return false;
    });
    if (!searched_all)
        return rg_i_key_answer::unknown;
    return first_packed == UINT32_MAX ? rg_i_key_answer::absent : rg_i_key_answer::present;
}

rg_i_key_answer rg_i_key_index_find_duplicate(rg_i_table_t * p_table, const kt_value_t & key, kt_uint32_t new_slot)
{
    index_t * const      p_index = p_table->p_key_index;
    const kt_data_type_t type    = p_table->p_columns[0].type;
    if (p_index == nullptr || p_index->has_nan || is_nan(type, key))
        return rg_i_key_answer::unknown;
    // The walk is one row short of the rows with the new one. Where the new slot isn't the last, the walk comes to it,
    // and mostly finds the key there.
    if (live_row_above(p_table, p_index, new_slot))
        return record_has_key(p_table, p_table->p_rows_fixed_index[new_slot].p_applied, key) ? rg_i_key_answer::present
                                                                                             : rg_i_key_answer::unknown;

    bool       found        = false;
    const bool searched_all = for_each_slot(p_index, hash_of(type, key, key.ptr_char), [&](kt_uint32_t slot) {
        const kt_char_ptr_t p_record = p_table->p_rows_fixed_index[slot].p_applied;
        found = slot != new_slot && p_record != nullptr && record_has_key(p_table, p_record, key);
        return found;
    });
    if (!searched_all)
        return rg_i_key_answer::unknown;
    return found ? rg_i_key_answer::present : rg_i_key_answer::absent;
}

void rg_i_key_index_note_walk(rg_i_table_t * p_table, kt_uint32_t rows_visited, kt_uint32_t uncounted_rows)
{
    const kt_uint64_t     rows = p_table->total_applied_rows;
    const std::atomic_ref visited(p_table->key_walk_rows);
    if (visited.fetch_add(rows_visited, std::memory_order_relaxed) + rows_visited < walks_worth * rows ||
        rows < fewest_rows)
        return;
    // Whoever takes the count makes the index; where none can be made, the next attempt is as many walks away.
    if (visited.exchange(0, std::memory_order_relaxed) < walks_worth * rows || current_index(p_table) != nullptr)
        return;
    index_t * const p_made = make_index(p_table, uncounted_rows);
    index_t *       p_none = nullptr;
    if (!std::atomic_ref(p_table->p_key_index).compare_exchange_strong(p_none, p_made, std::memory_order_acq_rel))
        free_index(p_made);
}

void rg_i_key_index_note_record(rg_i_table_t * p_table, kt_uint32_t slot)
{
    if (p_table->p_key_index != nullptr)
        enter_or_renew(p_table, key_of_record(p_table, p_table->p_rows_fixed_index[slot].p_applied), slot);
}

void rg_i_key_index_note_replacement(rg_i_table_t * p_table, kt_uint32_t slot, kt_char_ptr_t p_former_record,
                                     kt_char_ptr_t p_record)
{
    if (p_table->p_key_index == nullptr)
        return;
    const record_key_t former = key_of_record(p_table, p_former_record);
    const record_key_t key    = key_of_record(p_table, p_record);
    if (!former.comparable || former.hash != key.hash)
        enter_or_renew(p_table, key, slot);
}

void rg_i_key_index_drop(rg_i_table_t * p_table)
{
    free_index(p_table->p_key_index);
    p_table->p_key_index   = nullptr;
    p_table->key_walk_rows = 0;
}
