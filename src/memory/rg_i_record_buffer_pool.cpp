// SPDX-License-Identifier: MIT
// rg_i_record_buffer_pool: the allocator in which a table's metadata record and all its row records live.
//
// Layer: memory. Calls the index of free records, which leads to the same places as walking the chain, and the heap.
// Always holds: records tile their block; the free ones form one chain in ascending address order, and no two of them
// touch (but at the seams of a duplicated pool); used_bytes is exact. Of each block it is known from which byte on it
// is still zero as it came from the heap, so that handing out zeroed room costs what has been written, not what is
// free. Blocks are given back with the pool only, so total_bytes never falls.
// Locking: none; all uses run under the table's write lock, or on a table that no other thread can reach yet.
// Failure: RG_E_NO_MEMORY or RG_E_INTERNAL, and the pool is unchanged. Returning a record can't fail.
#include "rg_i_record_buffer_pool.h"

#include <unistd.h>

#include <algorithm>
#include <cassert>
#include <cstdint>
#include <cstdlib>

#include "frame/rg_i_trace.h"
#include "memory/rg_i_free_record_index.h"

namespace
{

constexpr char module_version[] = "rg_i_record_buffer_pool 1.0";

constexpr kt_uint32_t heads_of_a_block   = RG_I_RECORD_BUFFER_HEAD_LENGTH + RG_I_RECORD_HEAD_LENGTH;
constexpr kt_uint32_t smallest_remainder = RG_I_RECORD_HEAD_LENGTH + 2; // less stays with the record

// A small request buys room for a hundred like it, a big one just itself.
constexpr kt_uint32_t big_request         = 65536;
constexpr kt_uint32_t small_requests_each = 100;

constexpr kt_uint32_t written_ahead = 256; // bytes of fresh room that rows are built in one after the other

constexpr kt_uint32_t fewest_to_gather = 256; // for fewer, sorting isn't worth its memory

using pool_t  = rg_i_record_buffer_pool_t;
using block_t = rg_i_record_buffer_t;
using map_t   = rg_i_record_buffer_pool_duplication_map_t;
using place_t = rg_i_free_place_t;

rg_i_record_metadata_t * head_at(kt_char_ptr_t p)
{
    return reinterpret_cast<rg_i_record_metadata_t *>(p);
}

kt_char_ptr_t first_byte_of(block_t * p_block)
{
    return reinterpret_cast<kt_char_ptr_t>(p_block) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
}

// ---- What is zero already ----

kt_uint32_t offset_in(const rg_i_block_index_t * p_block, const kt_char_t * p_address)
{
    return static_cast<kt_uint32_t>(p_address - reinterpret_cast<const kt_char_t *>(p_block->p_block));
}

// Whatever lies before that address may have been written to.
void mark_written(rg_i_block_index_t * p_block, const kt_char_t * p_end)
{
    p_block->clean_from = std::max(p_block->clean_from, offset_in(p_block, p_end));
}

// Zeroes the part of the range that may have been written to.
void make_zero(const rg_i_block_index_t * p_block, kt_char_ptr_t p_from, kt_uint32_t length)
{
    const kt_uint32_t from = offset_in(p_block, p_from);
    if (from < p_block->clean_from)
        std::memset(p_from, 0, std::min(length, p_block->clean_from - from));
}

// ---- The free chain ----

// Puts a record between its neighbours in the chain and joins it with those it touches. Returns the bytes that are
// available for data again: its own, and a head for each join.
kt_uint32_t link_free_record(kt_char_ptr_t p_record, kt_char_ptr_t p_previous, kt_char_ptr_t p_next,
                             kt_char_ptr_t * p_free_chain)
{
    rg_i_record_metadata_t * const p_new            = head_at(p_record);
    kt_uint32_t                    used_bytes_freed = p_new->record_length - RG_I_RECORD_HEAD_LENGTH;

    p_new->p_next = p_next;
    if (p_next != nullptr && p_record + p_new->record_length == p_next) {
        p_new->record_length += head_at(p_next)->record_length;
        p_new->p_next = head_at(p_next)->p_next;
        used_bytes_freed += RG_I_RECORD_HEAD_LENGTH;
    }
    if (p_previous == nullptr) {
        *p_free_chain = p_record;
    } else if (p_previous + head_at(p_previous)->record_length == p_record) {
        head_at(p_previous)->record_length += p_new->record_length;
        head_at(p_previous)->p_next = p_new->p_next;
        used_bytes_freed += RG_I_RECORD_HEAD_LENGTH;
    } else {
        head_at(p_previous)->p_next = p_record;
    }
    return used_bytes_freed;
}

// The same outcome as rg_i_rb_insert_free_record, without the walk, and the index told.
kt_uint32_t insert_free_record(pool_t * p_pool, rg_i_block_index_t * p_block, kt_char_ptr_t p_record)
{
    const kt_char_ptr_t p_previous = rg_i_last_free_before(p_block, p_record);
    const kt_char_ptr_t p_next     = p_previous == nullptr ? p_pool->p_free_chain : head_at(p_previous)->p_next;
    const bool          joins_next = p_next != nullptr && p_record + head_at(p_record)->record_length == p_next;
    const bool joins_previous = p_previous != nullptr && p_previous + head_at(p_previous)->record_length == p_record;
    const kt_char_ptr_t p_behind_next = joins_next ? head_at(p_next)->p_next : nullptr;

    const kt_uint32_t used_bytes_freed = link_free_record(p_record, p_previous, p_next, &p_pool->p_free_chain);

    if (joins_next)
        rg_i_note_gone(p_block, p_next, p_behind_next);
    if (joins_previous)
        rg_i_note_grown(p_block, p_previous);
    else
        rg_i_note_free(p_block, p_record);
    const place_t freed =
        joins_previous ? place_t{p_previous, nullptr, p_block} : place_t{p_record, p_previous, p_block};
    rg_i_move_hint_after_freeing(p_pool->p_free_index, freed, !joins_previous, joins_next ? p_next : nullptr);
    return used_bytes_freed;
}

void free_at_once(pool_t * p_pool, kt_char_ptr_t p_data)
{
    const kt_char_ptr_t        p_record = p_data - RG_I_RECORD_HEAD_LENGTH;
    rg_i_block_index_t * const p_block  = rg_i_block_of(p_pool->p_free_index, p_record);
    assert(p_block != nullptr);
    head_at(p_record)->type = RG_RECORD_TYPE_FREE;
    p_pool->used_bytes -= insert_free_record(p_pool, p_block, p_record);
}

// ---- Blocks ----

// Gives the pool one more block, which is a single free record. False: no memory, nothing changed.
[[nodiscard]] bool add_block(pool_t * p_pool, kt_uint64_t size)
{
    if (size + p_pool->total_bytes > UINT32_MAX)
        return false;
    rg_i_block_index_t * const p_indexed =
        rg_i_make_indexed_block(&p_pool->p_free_index, static_cast<kt_uint32_t>(size));
    if (p_indexed == nullptr)
        return false;

    block_t * const p_block = p_indexed->p_block;
    (p_pool->p_last_record_buffer == nullptr ? p_pool->p_first_record_buffer : p_pool->p_last_record_buffer->p_next) =
        p_block;
    p_pool->p_last_record_buffer = p_block;
    p_pool->total_bytes += p_block->total_bytes;
    p_pool->used_bytes += heads_of_a_block;

    const kt_char_ptr_t p_record     = first_byte_of(p_block);
    head_at(p_record)->record_length = p_block->total_bytes - RG_I_RECORD_BUFFER_HEAD_LENGTH;
    head_at(p_record)->type          = RG_RECORD_TYPE_FREE;
    mark_written(p_indexed, p_record + RG_I_RECORD_HEAD_LENGTH);
    insert_free_record(p_pool, p_indexed, p_record);
    return true;
}

// ---- Lending and taking ----

// The first free record that holds so much data, with a new block if there is none. False: no memory.
[[nodiscard]] bool find_room(pool_t * p_pool, kt_uint32_t data_length, place_t * p_place)
{
    // No block can be made for more, and none that was made can hold more.
    if (data_length > UINT32_MAX - heads_of_a_block)
        return false;
    const kt_uint32_t record_length = data_length + RG_I_RECORD_HEAD_LENGTH;
    if (p_pool->p_free_index != nullptr) {
        *p_place = rg_i_first_fit(p_pool->p_free_index, record_length);
        if (p_place->p_record != nullptr)
            return true;
    }
    const kt_uint64_t factor = data_length < big_request ? small_requests_each : 1;
    if (!add_block(p_pool, factor * data_length + heads_of_a_block))
        return false;
    *p_place = rg_i_first_fit(p_pool->p_free_index, record_length);
    return true;
}

void hand_out(const place_t & place, kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
              kt_uint32_t * actual_data_length)
{
    *p_data                 = place.p_record + RG_I_RECORD_HEAD_LENGTH;
    *p_previous_free_record = place.p_previous;
    *actual_data_length     = rg_i_record_data_length(*p_data);
}

// The block that a lent record lies in: nearly always the one of the last search.
rg_i_block_index_t * block_of_lent(const pool_t * p_pool, const kt_char_t * p_data)
{
    const place_t & last = p_pool->p_free_index->hint;
    if (last.p_record == p_data - RG_I_RECORD_HEAD_LENGTH && last.p_block != nullptr)
        return last.p_block;
    return rg_i_block_of(p_pool->p_free_index, p_data - RG_I_RECORD_HEAD_LENGTH);
}

void fetch_to_write(const kt_char_t * p)
{
    constexpr int cache_line = 64;
    for (int line = 0; line < 3; ++line)
        __builtin_prefetch(p + line * cache_line, 1);
}

// Takes data_length bytes, which fit, from a lent record: what is left becomes a free record in its place, or stays
// with it if it is too small for one.
void take_from_lent(pool_t * p_pool, rg_i_block_index_t * p_block, kt_char_ptr_t p_data, kt_char_ptr_t p_previous,
                    kt_uint32_t data_length, kt_uint32_t record_type)
{
    const kt_char_ptr_t            p_record      = p_data - RG_I_RECORD_HEAD_LENGTH;
    rg_i_record_metadata_t * const p_head        = head_at(p_record);
    const kt_uint32_t              record_length = p_head->record_length;
    const kt_char_ptr_t            p_next        = p_head->p_next;
    const kt_uint32_t              remainder     = record_length - (data_length + RG_I_RECORD_HEAD_LENGTH);
    const kt_char_ptr_t            p_rest        = remainder < smallest_remainder ? nullptr : p_data + data_length;
    assert((p_previous == nullptr ? p_pool->p_free_chain : head_at(p_previous)->p_next) == p_record);

    p_head->type = record_type;
    rg_i_note_gone(p_block, p_record, p_next);
    if (p_rest == nullptr) {
        p_pool->used_bytes += record_length - RG_I_RECORD_HEAD_LENGTH;
        mark_written(p_block, p_record + record_length);
    } else {
        p_head->record_length = data_length + RG_I_RECORD_HEAD_LENGTH;
        *head_at(p_rest)      = {remainder, p_next, RG_RECORD_TYPE_FREE, 0};
        p_pool->used_bytes += data_length + RG_I_RECORD_HEAD_LENGTH;
        mark_written(p_block, p_rest + RG_I_RECORD_HEAD_LENGTH);
        rg_i_note_free(p_block, p_rest);
    }
    (p_previous == nullptr ? p_pool->p_free_chain : head_at(p_previous)->p_next) = p_rest != nullptr ? p_rest : p_next;
    rg_i_move_hint_after_taking(p_pool->p_free_index, p_record, p_previous, p_rest, p_next);
    // What the next request most likely writes, or looks at first.
    if (p_rest != nullptr)
        fetch_to_write(p_rest + written_ahead);
    else
        __builtin_prefetch(p_next);
}

// ---- Duplication ----

[[nodiscard]] bool make_map_arrays(map_t * p_map)
{
    const std::size_t count = std::max<std::size_t>(p_map->total, 1);
    p_map->p_begin          = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    p_map->p_end            = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    p_map->p_offset         = static_cast<kt_int32_t *>(std::malloc(count * sizeof(kt_int32_t)));
    p_map->p_to             = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    p_map->p_by_address     = static_cast<kt_uint32_t *>(std::malloc(count * sizeof(kt_uint32_t)));
    return p_map->p_begin != nullptr && p_map->p_end != nullptr && p_map->p_offset != nullptr &&
           p_map->p_to != nullptr && p_map->p_by_address != nullptr;
}

void enter_into_map(map_t * p_map, kt_uint32_t i, block_t * p_source, kt_char_ptr_t p_destination)
{
    p_map->p_begin[i]      = first_byte_of(p_source);
    p_map->p_end[i]        = reinterpret_cast<kt_char_ptr_t>(p_source) + p_source->total_bytes;
    p_map->p_to[i]         = p_destination;
    p_map->p_by_address[i] = i;
    // Kept because callers depend on it: p_offset has 32 bits, which are the distance only within 2 GiB. The mapping
    // goes by p_to.
    p_map->p_offset[i] = static_cast<kt_int32_t>(static_cast<kt_uint32_t>(
        reinterpret_cast<std::uintptr_t>(p_destination) - reinterpret_cast<std::uintptr_t>(p_map->p_begin[i])));
}

// Links the copies of a source block's free records to the end of the copy's chain. The copy's chain is in address
// order because its blocks are gone through as they lie in the copy, wherever the heap had put them in the source.
kt_char_ptr_t copy_chain_of_block(pool_t * p_to, rg_i_block_index_t * p_copy, rg_i_block_index_t * p_source,
                                  kt_char_ptr_t p_destination, kt_char_ptr_t p_tail)
{
    const kt_char_ptr_t p_begin = first_byte_of(p_source->p_block);
    const std::size_t   length  = p_source->p_block->total_bytes - RG_I_RECORD_BUFFER_HEAD_LENGTH;
    for (kt_char_ptr_t p = rg_i_first_free_in(p_source); p != nullptr; p = head_at(p)->p_next) {
        const std::uintptr_t offset = reinterpret_cast<std::uintptr_t>(p) - reinterpret_cast<std::uintptr_t>(p_begin);
        if (offset >= length)
            break; // the chain has left the block
        const kt_char_ptr_t p_copied                                       = p_destination + offset;
        head_at(p_copied)->p_next                                          = nullptr;
        (p_tail == nullptr ? p_to->p_free_chain : head_at(p_tail)->p_next) = p_copied;
        rg_i_note_free(p_copy, p_copied);
        p_tail = p_copied;
    }
    return p_tail;
}

} // namespace

kt_int32_t rg_i_rb_initialize_record_buffer_pool(kt_uint32_t                 total_pages,
                                                 rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    *p_record_buffer_pool = {};
    if (total_pages == 0)
        return 0;
    if (!add_block(p_record_buffer_pool, kt_uint64_t{total_pages} * static_cast<kt_uint64_t>(sysconf(_SC_PAGESIZE))))
        return rg_i_fail_no_memory(RG_HERE);
    return 0;
}

kt_int32_t rg_i_rb_uninitialize_record_buffer_pool(rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    rg_i_drop_index(p_record_buffer_pool->p_free_index);
    rg_i_rb_give_up_blocks(p_record_buffer_pool);
    *p_record_buffer_pool = {};
    return 0;
}

kt_int32_t rg_i_rb_find_suitable_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t data_length,
                                        kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
                                        kt_uint32_t * actual_data_length)
{
    place_t place;
    if (!find_room(p_record_buffer_pool, data_length, &place))
        return rg_i_fail_no_memory(RG_HERE);
    hand_out(place, p_data, p_previous_free_record, actual_data_length);
    make_zero(place.p_block, *p_data, *actual_data_length);
    // The caller may write anywhere in it, and needn't come back to say so.
    mark_written(place.p_block, *p_data + *actual_data_length);
    return 0;
}

kt_int32_t rg_i_rb_allocate_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                                   kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length,
                                   kt_uint32_t record_type)
{
    if (data_length > rg_i_record_data_length(p_data))
        return rg_i_fail_internal(RG_HERE);
    take_from_lent(p_record_buffer_pool, block_of_lent(p_record_buffer_pool, p_data), p_data, p_previous_free_record,
                   data_length, record_type);
    return 0;
}

kt_int32_t rg_i_rb_free_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data)
{
    pool_t & pool = *p_record_buffer_pool;
    if (pool.gathered < pool.most_gathered)
        pool.p_gathered[pool.gathered++] = p_data;
    else
        free_at_once(p_record_buffer_pool, p_data);
    return 0;
}

void rg_i_rb_gather_frees(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t expected)
{
    if (expected < fewest_to_gather)
        return;
    p_record_buffer_pool->p_gathered = static_cast<kt_char_ptr_t *>(std::malloc(expected * sizeof(kt_char_ptr_t)));
    if (p_record_buffer_pool->p_gathered != nullptr)
        p_record_buffer_pool->most_gathered = expected;
}

void rg_i_rb_free_gathered(rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    pool_t & pool = *p_record_buffer_pool;
    std::sort(pool.p_gathered, pool.p_gathered + pool.gathered);
    for (kt_uint32_t i = 0; i < pool.gathered; ++i)
        free_at_once(p_record_buffer_pool, pool.p_gathered[i]);
    std::free(pool.p_gathered);
    pool.p_gathered = nullptr;
    pool.gathered = pool.most_gathered = 0;
}

kt_uint32_t rg_i_rb_insert_free_record(kt_char_ptr_t p_new_free_record, kt_char_ptr_t * p_free_chain_returned,
                                       kt_char_ptr_t * p_previous_free_record_returned)
{
    kt_char_ptr_t p_previous = nullptr;
    kt_char_ptr_t p_next     = *p_free_chain_returned;
    while (p_next != nullptr && p_next < p_new_free_record) {
        p_previous = p_next;
        p_next     = head_at(p_next)->p_next;
    }
    *p_previous_free_record_returned = p_previous;
    return link_free_record(p_new_free_record, p_previous, p_next, p_free_chain_returned);
}

kt_int32_t rg_i_reserve_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t length, kt_uint32_t type,
                               kt_char_ptr_t * p_record_data)
{
    place_t place;
    if (!find_room(p_record_buffer_pool, length, &place))
        return rg_i_fail_no_memory(RG_HERE);
    const kt_char_ptr_t p_data = place.p_record + RG_I_RECORD_HEAD_LENGTH;
    make_zero(place.p_block, p_data, std::min(length + smallest_remainder - 1, rg_i_record_data_length(p_data)));
    take_from_lent(p_record_buffer_pool, place.p_block, p_data, place.p_previous, length, type);
    *p_record_data = p_data;
    return 0;
}

kt_int32_t rg_i_rb_lend_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t data_length,
                               kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
                               kt_uint32_t * actual_data_length)
{
    place_t place;
    if (!find_room(p_record_buffer_pool, data_length, &place))
        return rg_i_fail_no_memory(RG_HERE);
    hand_out(place, p_data, p_previous_free_record, actual_data_length);
    return 0;
}

kt_int32_t rg_i_rb_take_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                               kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length, kt_uint32_t record_type)
{
    const kt_uint32_t lent_length = rg_i_record_data_length(p_data);
    if (data_length > lent_length)
        return rg_i_fail_internal(RG_HERE);
    rg_i_block_index_t * const p_block = block_of_lent(p_record_buffer_pool, p_data);
    if (lent_length - data_length < smallest_remainder)
        make_zero(p_block, p_data + data_length, lent_length - data_length);
    take_from_lent(p_record_buffer_pool, p_block, p_data, p_previous_free_record, data_length, record_type);
    return 0;
}

void rg_i_rb_give_back_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                              kt_uint32_t bytes_written)
{
    mark_written(block_of_lent(p_record_buffer_pool, p_data),
                 p_data + std::min(bytes_written, rg_i_record_data_length(p_data)));
}

kt_int32_t rg_i_rb_duplicate_record_buffer_pool(rg_i_record_buffer_pool_t * p_from, rg_i_record_buffer_pool_t * p_to,
                                                rg_i_record_buffer_pool_duplication_map_t ** p_duplication_map)
{
    auto * const p_map = static_cast<map_t *>(std::calloc(1, sizeof(map_t)));
    if (p_map == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    for (const block_t * p_block = p_from->p_first_record_buffer; p_block != nullptr; p_block = p_block->p_next)
        ++p_map->total;

    // The heads of all blocks but one vanish. For a pool without a block this makes one of 12 bytes.
    const kt_uint32_t vanishing = (p_map->total - 1) * RG_I_RECORD_BUFFER_HEAD_LENGTH;
    *p_to                       = {};
    p_to->total_bytes           = p_from->total_bytes - vanishing;
    p_to->used_bytes            = p_from->used_bytes - vanishing;

    rg_i_block_index_t * const p_copy =
        make_map_arrays(p_map) ? rg_i_make_indexed_block(&p_to->p_free_index, p_to->total_bytes) : nullptr;
    if (p_copy == nullptr) {
        rg_i_rb_free_duplication_map(p_map);
        return rg_i_fail_no_memory(RG_HERE);
    }

    // Nothing below fails.
    kt_char_ptr_t p_destination = first_byte_of(p_copy->p_block);
    kt_char_ptr_t p_tail        = nullptr;
    kt_uint32_t   i             = 0;
    for (block_t * p_source = p_from->p_first_record_buffer; p_source != nullptr; p_source = p_source->p_next, ++i) {
        enter_into_map(p_map, i, p_source, p_destination);
        rg_i_block_index_t * const p_indexed =
            rg_i_block_of(p_from->p_free_index, reinterpret_cast<kt_char_ptr_t>(p_source));
        // What lies behind is zero on both sides.
        const std::size_t written = p_indexed->clean_from - RG_I_RECORD_BUFFER_HEAD_LENGTH;
        std::memcpy(p_destination, p_map->p_begin[i], written);
        mark_written(p_copy, p_destination + written);
        p_tail = copy_chain_of_block(p_to, p_copy, p_indexed, p_destination, p_tail);
        p_destination += p_map->p_end[i] - p_map->p_begin[i];
    }
    std::sort(p_map->p_by_address, p_map->p_by_address + p_map->total,
              [p_map](kt_uint32_t a, kt_uint32_t b) { return p_map->p_begin[a] < p_map->p_begin[b]; });
    p_to->p_first_record_buffer = p_to->p_last_record_buffer = p_copy->p_block;
    *p_duplication_map                                       = p_map;
    return 0;
}

kt_char_ptr_t rg_i_rb_map_duplicated_address(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map,
                                             kt_char_ptr_t                               p_from)
{
    map_t &    map       = *p_duplication_map;
    const auto mapped_in = [&map, p_from](kt_uint32_t block) {
        return map.p_to[block] + (p_from - map.p_begin[block]);
    };
    // Rows that follow each other mostly lie in one block.
    if (map.recent < map.total && p_from >= map.p_begin[map.recent] && p_from < map.p_end[map.recent])
        return mapped_in(map.recent);
    const kt_uint32_t * const p_order = map.p_by_address;
    // The first block that begins behind the address: the one before it is the only one that can hold it.
    const kt_uint32_t * const p_behind =
        std::upper_bound(p_order, p_order + map.total, p_from,
                         [&map](kt_char_ptr_t p, kt_uint32_t block) { return p < map.p_begin[block]; });
    if (p_behind == p_order)
        return nullptr;
    const kt_uint32_t i = p_behind[-1];
    if (p_from >= map.p_end[i])
        return nullptr;
    map.recent = i;
    return mapped_in(i);
}

kt_int32_t rg_i_rb_free_duplication_map(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map)
{
    if (p_duplication_map == nullptr)
        return 0;
    std::free(p_duplication_map->p_begin);
    std::free(p_duplication_map->p_end);
    std::free(p_duplication_map->p_offset);
    std::free(p_duplication_map->p_to);
    std::free(p_duplication_map->p_by_address);
    std::free(p_duplication_map);
    return 0;
}
