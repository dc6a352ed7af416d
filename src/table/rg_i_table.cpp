// SPDX-License-Identifier: MIT
// rg_i_table: the row index of a table, its free slots, its change lists, and where values lie in a row record.
//
// Layer: table. Calls the record pool and the hash table; called by everything that works on rows.
// Always holds: the free chain runs through p_pending_change of the free slots in ascending order, so that the lowest
// free fixed index is the next one used, and the free slot index behind the slots holds exactly the slots of the chain.
// A row is on at most one change list. Apart from p_rows_free_chain, only change entries hold addresses of slots.
// Locking: the caller holds the table's write lock, or no other thread can see the table yet.
// Failure: only memory can run out, and then nothing has changed.
#include "rg_i_table.h"

#include <cassert>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"
#include "memory/rg_i_large_pages.h"
#include "rg_i_change_entries.h"
#include "rg_i_free_slot_index.h"
#include "storage/rg_i_disk_format.h"

namespace
{

constexpr char module_version[] = "rg_i_table 1.0";

constexpr kt_uint32_t rows_if_unspecified = 10;

static_assert(sizeof(rg_i_index_entry_t) % alignof(kt_uint64_t) == 0, "the words behind the slots are aligned");

[[nodiscard]] kt_uint64_t * free_slot_index(const rg_i_table_t * p_table)
{
    return reinterpret_cast<kt_uint64_t *>(p_table->p_rows_fixed_index + p_table->maximum_rows);
}

// Zeroes the slots from first_slot on, and makes them the whole free chain. No other slot may be free.
void free_slots_from(rg_i_table_t * p_table, kt_uint32_t first_slot)
{
    rg_i_index_entry_t * p_slots = p_table->p_rows_fixed_index;
    const kt_uint32_t    end     = p_table->maximum_rows;
    for (kt_uint32_t slot = first_slot; slot < end; ++slot) {
        p_slots[slot]                  = rg_i_index_entry_t{};
        p_slots[slot].p_pending_change = slot + 1 < end ? p_slots + slot + 1 : nullptr;
    }
    p_table->p_rows_free_chain = first_slot < end ? p_slots + first_slot : nullptr;
    rg_i_free_slot_index_fill(free_slot_index(p_table), end, first_slot);
}

// Leads the entries of a change list to the slots' new place.
void follow_moved_slots(rg_i_change_entry_t * p_first, std::uintptr_t old_slots, rg_i_index_entry_t * p_new_slots)
{
    for (rg_i_change_entry_t * p_entry = p_first; p_entry != nullptr; p_entry = p_entry->p_next) {
        const std::uintptr_t distance = reinterpret_cast<std::uintptr_t>(p_entry->p_index_entry) - old_slots;
        p_entry->p_index_entry        = p_new_slots + distance / sizeof(rg_i_index_entry_t);
    }
}

// Head and tail of one of the two change lists.
struct change_list_t {
    rg_i_change_entry_t *& p_head;
    rg_i_change_entry_t *& p_tail;
};

[[nodiscard]] change_list_t change_list(rg_i_table_t * p_table, kt_uint32_t deletion)
{
    if (deletion != 0)
        return {p_table->p_delete_rows_change_list, p_table->p_delete_rows_change_list_tail};
    return {p_table->p_rows_change_list, p_table->p_rows_change_list_tail};
}

void append(const change_list_t & list, rg_i_change_entry_t * p_entry)
{
    p_entry->p_next = nullptr;
    p_entry->p_prev = list.p_tail;
    if (list.p_tail != nullptr)
        list.p_tail->p_next = p_entry;
    else
        list.p_head = p_entry;
    list.p_tail = p_entry;
}

void take_off(const change_list_t & list, rg_i_change_entry_t * p_entry)
{
    if (p_entry->p_prev != nullptr)
        p_entry->p_prev->p_next = p_entry->p_next;
    else
        list.p_head = p_entry->p_next;
    if (p_entry->p_next != nullptr)
        p_entry->p_next->p_prev = p_entry->p_prev;
    else
        list.p_tail = p_entry->p_prev;
}

// Moves the last row of the packed index into the place of one that leaves. A file whose deletions don't fit its rows
// leaves rows that no packed position leads to: those go without a trace there.
void leave_packed_index(rg_i_table_t * p_table, const rg_i_index_entry_t & leaving)
{
    const kt_uint32_t packed_index = leaving.packed_index;
    if (packed_index >= p_table->total_applied_rows ||
        p_table->p_rows_packed_index[packed_index] != rg_i_fixed_row_index(p_table, &leaving))
        return;
    const kt_uint32_t moved_row = p_table->p_rows_packed_index[--p_table->total_applied_rows];

    p_table->p_rows_packed_index[packed_index]          = moved_row;
    p_table->p_rows_fixed_index[moved_row].packed_index = packed_index;
}

// Rows that were filled in directly, to be entered in the packed index and the hash table. A bucket lies anywhere in
// memory: those of some rows are fetched at once, so that their coming overlaps.
struct new_rows_t {
    static constexpr kt_uint32_t most = 32;

    kt_uint32_t   total = 0;
    kt_uint32_t   slots[most];
    kt_char_ptr_t keys[most]; // NULL: the record is damaged
    kt_uint32_t   buckets[most];
};

void find_buckets(const rg_i_table_t * p_table, new_rows_t & rows)
{
    for (kt_uint32_t i = 0; i < rows.total; ++i) {
        rows.keys[i] = rg_i_row_key(p_table, p_table->p_rows_fixed_index[rows.slots[i]].p_committed);
        if (rows.keys[i] == nullptr)
            return;
        rows.buckets[i] = rg_i_hash_table_bucket(p_table->p_rows_hash_table, rows.keys[i]);
        rg_i_hash_table_fetch_bucket(p_table->p_rows_hash_table, rows.buckets[i]);
    }
}

[[nodiscard]] kt_int32_t enter_in_hash_table(rg_i_table_t * p_table, new_rows_t & rows)
{
    find_buckets(p_table, rows);
    for (kt_uint32_t i = 0; i < rows.total; ++i) {
        if (rows.keys[i] == nullptr)
            return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
        rg_i_index_entry_t &      entry                = p_table->p_rows_fixed_index[rows.slots[i]];
        rg_hash_table_element_t * p_hash_table_element = nullptr;
        // A duplicate key has no error record: it passes from here to the caller as it is.
        if (const kt_int32_t rc =
                rg_i_hash_table_add_to_bucket(p_table->p_rows_hash_table, rows.buckets[i], rows.keys[i], rows.slots[i],
                                              &p_hash_table_element, p_table->p_columns[0].qualifier);
            rc != 0)
            return rc;
        entry.hash_index           = rows.buckets[i];
        entry.p_hash_table_element = p_hash_table_element;
    }
    return 0;
}

[[nodiscard]] kt_int32_t give_secondary_access(rg_i_table_t * p_table, new_rows_t & rows, kt_uint32_t * p_packed_index)
{
    for (kt_uint32_t i = 0; i < rows.total; ++i) {
        p_table->p_rows_packed_index[*p_packed_index]           = rows.slots[i];
        p_table->p_rows_fixed_index[rows.slots[i]].packed_index = (*p_packed_index)++;
    }
    if (p_table->p_rows_hash_table != nullptr)
        if (const kt_int32_t rc = enter_in_hash_table(p_table, rows); rc != 0)
            return rc;
    rows.total = 0;
    return 0;
}

} // namespace

// ---- Row records ----

kt_uint32_t rg_i_row_indirect_length(const rg_i_table_t * p_table, const kt_char_t * p_record_data)
{
    return rg_i_record_data_length(p_record_data) - rg_i_row_fixed_length(p_table->total_columns);
}

kt_char_ptr_t rg_i_row_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record_data)
{
    kt_char_ptr_t        p_slot   = rg_i_row_slot(p_record_data, 0);
    const kt_data_type_t key_type = p_table->p_columns[0].type;
    if (!rg_i_type_is_indirect(key_type))
        return p_slot;

    kt_pmsg_value_anchor_t anchor;
    std::memcpy(&anchor, p_slot, sizeof anchor);
    const kt_uint32_t indirect_length = rg_i_row_indirect_length(p_table, p_record_data);
    if (anchor.offset > indirect_length || anchor.length > indirect_length - anchor.offset)
        return nullptr;

    kt_char_ptr_t p_key = rg_i_row_indirect_data(p_record_data, p_table->total_columns) + anchor.offset;
    if (key_type == KT_CHAR_PTR)
        return anchor.length > 0 && p_key[anchor.length - 1] == '\0' ? p_key : nullptr;
    return key_type == KT_RSRC_HANDLE_PTR && anchor.length >= sizeof(kt_resource_handle_t) ? p_key : nullptr;
}

kt_char_ptr_t rg_i_default_data(const rg_i_table_t * p_table)
{
    return reinterpret_cast<kt_char_ptr_t>(p_table->p_columns + p_table->total_columns);
}

kt_uint32_t rg_i_default_data_length(const rg_i_table_t * p_table)
{
    if (p_table->total_columns == 0)
        return 0;
    // The first name stands directly behind the default data of the record that it lies in.
    const kt_char_t * const p_behind_columns =
        rg_i_names_record_data(p_table) + sizeof(rg_i_metadata_head_t) + p_table->total_columns * sizeof(rg_column_t);
    return static_cast<kt_uint32_t>(p_table->p_columns[0].name - p_behind_columns);
}

void rg_i_dup_nonscalar_value(kt_data_type_t type, kt_value_t * p_from_value, kt_value_t * p_to_value)
{
    *p_to_value = *p_from_value;
    if (p_to_value->ptr_char != nullptr)
        return;
    switch (type) {
    case KT_CHAR_PTR:
        p_to_value->ptr_char = ku_ptr_empty_char_1;
        break;
    case KT_BINARY_PTR:
        p_to_value->ptr_binary = ku_ptr_empty_binary_1;
        break;
    case KT_RSRC_HANDLE_PTR:
        p_to_value->ptr_rsrc_handle = ku_ptr_invld_rsrc_hndl_1;
        break;
    case KT_SD_PTR:
        p_to_value->ptr_sd = ku_ptr_empty_sd_1;
        break;
    default: // an empty self-describing byte string is the same bytes
        p_to_value->ptr_array = ku_ptr_empty_array_1;
        break;
    }
}

// ---- The row index ----

size_t rg_i_rows_fixed_index_bytes(kt_uint32_t maximum_rows)
{
    return maximum_rows * sizeof(rg_i_index_entry_t) + rg_i_free_slot_index_words(maximum_rows) * sizeof(kt_uint64_t);
}

kt_int32_t rg_i_establish_rows_index(rg_i_table_t * p_table, kt_uint32_t maximum_rows)
{
    if (maximum_rows == 0)
        maximum_rows = rows_if_unspecified;

    p_table->p_rows_fixed_index =
        static_cast<rg_i_index_entry_t *>(std::calloc(1, rg_i_rows_fixed_index_bytes(maximum_rows)));
    if (p_table->p_rows_fixed_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    rg_i_prefer_large_pages(p_table->p_rows_fixed_index, rg_i_rows_fixed_index_bytes(maximum_rows));
    p_table->p_rows_packed_index = static_cast<kt_uint32_t *>(std::calloc(maximum_rows, sizeof(kt_uint32_t)));
    if (p_table->p_rows_packed_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE); // rg_i_close_table frees the other array
    rg_i_prefer_large_pages(p_table->p_rows_packed_index, maximum_rows * sizeof(kt_uint32_t));

    p_table->maximum_rows = maximum_rows;
    free_slots_from(p_table, 0);
    return 0;
}

kt_int32_t rg_i_establish_secondary_row_access(rg_i_table_t * p_table)
{
    new_rows_t  rows;
    kt_uint32_t packed_index = 0;
    for (kt_uint32_t slot = 0; packed_index + rows.total < p_table->total_committed_rows; ++slot) {
        // Only a file whose deletions don't fit its rows can count more rows than there are.
        if (slot == p_table->maximum_rows) {
            if (const kt_int32_t rc = give_secondary_access(p_table, rows, &packed_index); rc != 0)
                return rc;
            return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
        }
        if (p_table->p_rows_fixed_index[slot].p_committed == nullptr)
            continue;
        rows.slots[rows.total++] = slot;
        if (rows.total == rows.most)
            if (const kt_int32_t rc = give_secondary_access(p_table, rows, &packed_index); rc != 0)
                return rc;
    }
    return give_secondary_access(p_table, rows, &packed_index);
}

kt_int32_t rg_i_grow_index(rg_i_table_t * p_table, kt_uint32_t total_new_rows)
{
    assert(p_table->p_rows_free_chain == nullptr);
    const kt_uint32_t first_new_slot = p_table->maximum_rows;
    if (total_new_rows > UINT32_MAX - first_new_slot)
        return rg_i_fail_no_memory(RG_HERE);
    const kt_uint32_t maximum_rows = first_new_slot + total_new_rows;

    void * p_packed_index = std::realloc(p_table->p_rows_packed_index, maximum_rows * sizeof(kt_uint32_t));
    if (p_packed_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    rg_i_prefer_large_pages(p_packed_index, maximum_rows * sizeof(kt_uint32_t));
    p_table->p_rows_packed_index = static_cast<kt_uint32_t *>(p_packed_index);

    const auto old_slots     = reinterpret_cast<std::uintptr_t>(p_table->p_rows_fixed_index);
    void *     p_fixed_index = std::realloc(p_table->p_rows_fixed_index, rg_i_rows_fixed_index_bytes(maximum_rows));
    if (p_fixed_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE); // a packed index that is longer than needed does no harm
    rg_i_prefer_large_pages(p_fixed_index, rg_i_rows_fixed_index_bytes(maximum_rows));

    // Nothing below fails.
    p_table->p_rows_fixed_index = static_cast<rg_i_index_entry_t *>(p_fixed_index);
    p_table->maximum_rows       = maximum_rows;
    std::memset(static_cast<void *>(p_table->p_rows_fixed_index + first_new_slot), 0,
                total_new_rows * sizeof(rg_i_index_entry_t));
    free_slots_from(p_table, first_new_slot);
    if (reinterpret_cast<std::uintptr_t>(p_fixed_index) != old_slots) {
        follow_moved_slots(p_table->p_rows_change_list, old_slots, p_table->p_rows_fixed_index);
        follow_moved_slots(p_table->p_delete_rows_change_list, old_slots, p_table->p_rows_fixed_index);
    }
    return 0;
}

// ---- Free slots ----

void rg_i_rows_free_chain_insert(rg_i_table_t * p_table, rg_i_index_entry_t * p_new_entry)
{
    const kt_uint32_t slot    = rg_i_fixed_row_index(p_table, p_new_entry);
    kt_uint64_t *     p_words = free_slot_index(p_table);
    if (rg_i_free_slot_index_contains(p_words, slot))
        return; // a damaged file may free a row twice; the chain must not meet itself

    *p_new_entry            = rg_i_index_entry_t{};
    const kt_uint32_t below = rg_i_free_slot_index_below(p_words, p_table->maximum_rows, slot);
    if (below == RG_I_NO_SLOT) {
        p_new_entry->p_pending_change = p_table->p_rows_free_chain;
        p_table->p_rows_free_chain    = p_new_entry;
    } else {
        rg_i_index_entry_t & previous = p_table->p_rows_fixed_index[below];
        p_new_entry->p_pending_change = previous.p_pending_change;
        previous.p_pending_change     = p_new_entry;
    }
    rg_i_free_slot_index_add(p_words, p_table->maximum_rows, slot);
}

rg_i_index_entry_t * rg_i_rows_free_chain_remove(rg_i_table_t * p_table)
{
    rg_i_index_entry_t * p_entry = p_table->p_rows_free_chain;
    if (p_entry == nullptr)
        return nullptr;
    p_table->p_rows_free_chain = static_cast<rg_i_index_entry_t *>(p_entry->p_pending_change);
    p_entry->p_pending_change  = nullptr;
    rg_i_free_slot_index_remove(free_slot_index(p_table), p_table->maximum_rows,
                                rg_i_fixed_row_index(p_table, p_entry));
    return p_entry;
}

void rg_i_rows_free_chain_take(rg_i_table_t * p_table, rg_i_index_entry_t * p_entry)
{
    const kt_uint32_t slot    = rg_i_fixed_row_index(p_table, p_entry);
    kt_uint64_t *     p_words = free_slot_index(p_table);
    assert(rg_i_free_slot_index_contains(p_words, slot));
    const kt_uint32_t below = rg_i_free_slot_index_below(p_words, p_table->maximum_rows, slot);
    if (below == RG_I_NO_SLOT)
        p_table->p_rows_free_chain = static_cast<rg_i_index_entry_t *>(p_entry->p_pending_change);
    else
        p_table->p_rows_fixed_index[below].p_pending_change = p_entry->p_pending_change;
    p_entry->p_pending_change = nullptr;
    rg_i_free_slot_index_remove(p_words, p_table->maximum_rows, slot);
}

kt_int32_t rg_i_remove_row(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry)
{
    if (p_table->p_rows_hash_table != nullptr && p_index_entry->p_hash_table_element != nullptr)
        if (const kt_int32_t rc = rg_i_hash_table_remove_element(p_table->p_rows_hash_table, p_index_entry->hash_index,
                                                                 p_index_entry->p_hash_table_element);
            rc != 0)
            return rc;

    kt_char_ptr_t p_applied   = p_index_entry->p_applied;
    kt_char_ptr_t p_committed = p_index_entry->p_committed;
    if (p_applied != nullptr && p_applied != p_committed)
        rg_i_rb_free_record(&p_table->record_buffer_pool, p_applied);
    if (p_committed != nullptr)
        rg_i_rb_free_record(&p_table->record_buffer_pool, p_committed);

    leave_packed_index(p_table, *p_index_entry);
    rg_i_rows_free_chain_insert(p_table, p_index_entry);
    return 0;
}

// ---- Change lists ----

kt_int32_t rg_i_common_add_change_entry(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry,
                                        kt_uint32_t deletion)
{
    auto * p_entry = static_cast<rg_i_change_entry_t *>(p_index_entry->p_pending_change);
    if (p_entry != nullptr) {
        if (p_entry->deletion == deletion)
            return 0; // listed already, and keeps its place
        take_off(change_list(p_table, p_entry->deletion), p_entry);
    } else {
        p_entry = rg_i_take_change_entry(p_table);
        if (p_entry == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
    }

    p_entry->deletion      = deletion;
    p_entry->p_index_entry = p_index_entry;
    append(change_list(p_table, deletion), p_entry);
    p_index_entry->p_pending_change = p_entry;
    return 0;
}

kt_int32_t rg_i_add_change_entry(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry)
{
    return rg_i_common_add_change_entry(p_table, p_index_entry, 0);
}

void rg_i_free_change_lists(rg_i_table_t * p_table)
{
    rg_i_free_change_entries(p_table);
    p_table->p_rows_change_list             = nullptr;
    p_table->p_rows_change_list_tail        = nullptr;
    p_table->p_delete_rows_change_list      = nullptr;
    p_table->p_delete_rows_change_list_tail = nullptr;
}

// ---- The file's two names ----

// Stands ready for placing records by the blocks of the file system.
kt_int32_t rg_i_record_contained_in_block(rg_i_table_t * p_table, kt_uint32_t offset, kt_uint32_t length,
                                          kt_uint32_t * block_id)
{
    const kt_uint64_t end = kt_uint64_t{offset} + length;
    if (p_table->block_size == 0) {
        *block_id = 0; // without blocks everything lies in one
        return 1;
    }
    *block_id = offset / p_table->block_size;
    return end / p_table->block_size == *block_id ? 1 : 0;
}

kt_char_ptr_t rg_i_set_data_path(rg_i_table_t * p_table)
{
    p_table->p_file_path[p_table->file_path_length] = '\0';
    return p_table->p_file_path;
}

kt_char_ptr_t rg_i_set_rewrite_path(rg_i_table_t * p_table)
{
    p_table->p_file_path[p_table->file_path_length] = '.';
    return p_table->p_file_path;
}
