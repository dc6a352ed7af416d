// SPDX-License-Identifier: MIT
// rg_i_record_buffer_pool: first version, walking the chain.
#include "rg_i_record_buffer_pool.h"

#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_record_buffer_pool 1.0";

constexpr kt_uint32_t heads_of_a_block        = RG_I_RECORD_BUFFER_HEAD_LENGTH + RG_I_RECORD_HEAD_LENGTH;
constexpr kt_uint32_t smallest_remainder      = RG_I_RECORD_HEAD_LENGTH + 2;
constexpr kt_uint32_t small_request_limit     = 65536;
constexpr kt_uint32_t requests_in_small_block = 100;

using pool_t   = rg_i_record_buffer_pool_t;
using block_t  = rg_i_record_buffer_t;
using record_t = rg_i_record_metadata_t;

record_t * head_at(kt_char_ptr_t p)
{
    return reinterpret_cast<record_t *>(p);
}

block_t * new_block(pool_t * p_pool, kt_uint64_t size)
{
    if (size > UINT32_MAX || size + p_pool->total_bytes > UINT32_MAX)
        return nullptr;
    auto * const p_block = static_cast<block_t *>(std::calloc(1, size));
    if (p_block != nullptr)
        p_block->total_bytes = static_cast<kt_uint32_t>(size);
    return p_block;
}

void append_block(pool_t * p_pool, block_t * p_block)
{
    (p_pool->p_last_record_buffer == nullptr ? p_pool->p_first_record_buffer : p_pool->p_last_record_buffer->p_next) =
        p_block;
    p_pool->p_last_record_buffer = p_block;
    p_pool->total_bytes += p_block->total_bytes;
    p_pool->used_bytes += heads_of_a_block;
}

kt_char_ptr_t make_one_free_record(block_t * p_block)
{
    const kt_char_ptr_t p_record     = reinterpret_cast<kt_char_ptr_t>(p_block) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
    head_at(p_record)->record_length = p_block->total_bytes - RG_I_RECORD_BUFFER_HEAD_LENGTH;
    head_at(p_record)->type          = RG_RECORD_TYPE_FREE;
    return p_record;
}

} // namespace

kt_int32_t rg_i_rb_initialize_record_buffer_pool(kt_uint32_t                 total_pages,
                                                 rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    *p_record_buffer_pool = {};
    if (total_pages == 0)
        return 0;
    block_t * const p_block =
        new_block(p_record_buffer_pool, kt_uint64_t{total_pages} * static_cast<kt_uint64_t>(sysconf(_SC_PAGESIZE)));
    if (p_block == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    append_block(p_record_buffer_pool, p_block);
    p_record_buffer_pool->p_free_chain = make_one_free_record(p_block);
    return 0;
}

kt_int32_t rg_i_rb_uninitialize_record_buffer_pool(rg_i_record_buffer_pool_t * p_record_buffer_pool)
{
    for (block_t * p_block = p_record_buffer_pool->p_first_record_buffer; p_block != nullptr;) {
        block_t * const p_next = p_block->p_next;
        std::free(p_block);
        p_block = p_next;
    }
    *p_record_buffer_pool = {};
    return 0;
}

kt_int32_t rg_i_rb_find_suitable_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t data_length,
                                        kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
                                        kt_uint32_t * actual_data_length)
{
    kt_char_ptr_t p_previous = nullptr;
    kt_char_ptr_t p_record   = p_record_buffer_pool->p_free_chain;
    while (p_record != nullptr && head_at(p_record)->record_length - RG_I_RECORD_HEAD_LENGTH < data_length) {
        p_previous = p_record;
        p_record   = head_at(p_record)->p_next;
    }
    if (p_record != nullptr) {
        std::memset(p_record + RG_I_RECORD_HEAD_LENGTH, 0, head_at(p_record)->record_length - RG_I_RECORD_HEAD_LENGTH);
    } else {
        const kt_uint64_t factor  = data_length < small_request_limit ? requests_in_small_block : 1;
        block_t * const   p_block = new_block(p_record_buffer_pool, factor * data_length + heads_of_a_block);
        if (p_block == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
        append_block(p_record_buffer_pool, p_block);
        p_record = make_one_free_record(p_block);
        rg_i_rb_insert_free_record(p_record, &p_record_buffer_pool->p_free_chain, &p_previous);
    }
    *p_data                 = p_record + RG_I_RECORD_HEAD_LENGTH;
    *p_previous_free_record = p_previous;
    *actual_data_length     = head_at(p_record)->record_length - RG_I_RECORD_HEAD_LENGTH;
    return 0;
}

kt_int32_t rg_i_rb_allocate_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                                   kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length,
                                   kt_uint32_t record_type)
{
    const kt_char_ptr_t p_record      = p_data - RG_I_RECORD_HEAD_LENGTH;
    const kt_uint32_t   record_length = head_at(p_record)->record_length;
    if (data_length > record_length - RG_I_RECORD_HEAD_LENGTH)
        return rg_i_fail_internal(RG_HERE);

    const kt_uint32_t remainder   = record_length - (data_length + RG_I_RECORD_HEAD_LENGTH);
    kt_char_ptr_t     p_successor = head_at(p_record)->p_next;
    head_at(p_record)->type       = record_type;
    if (remainder < smallest_remainder) {
        p_record_buffer_pool->used_bytes += record_length - RG_I_RECORD_HEAD_LENGTH;
    } else {
        head_at(p_record)->record_length   = data_length + RG_I_RECORD_HEAD_LENGTH;
        const kt_char_ptr_t p_rest         = p_data + data_length;
        head_at(p_rest)->record_length     = remainder;
        head_at(p_rest)->p_next            = p_successor;
        head_at(p_rest)->type              = RG_RECORD_TYPE_FREE;
        head_at(p_rest)->disk_table_offset = 0;
        p_successor                        = p_rest;
        p_record_buffer_pool->used_bytes += data_length + RG_I_RECORD_HEAD_LENGTH;
    }
    if (p_previous_free_record == nullptr)
        p_record_buffer_pool->p_free_chain = p_successor;
    else
        head_at(p_previous_free_record)->p_next = p_successor;
    return 0;
}

kt_int32_t rg_i_rb_free_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data)
{
    kt_char_ptr_t       p_previous = nullptr;
    const kt_char_ptr_t p_record   = p_data - RG_I_RECORD_HEAD_LENGTH;
    head_at(p_record)->type        = RG_RECORD_TYPE_FREE;
    p_record_buffer_pool->used_bytes -=
        rg_i_rb_insert_free_record(p_record, &p_record_buffer_pool->p_free_chain, &p_previous);
    return 0;
}

kt_uint32_t rg_i_rb_insert_free_record(kt_char_ptr_t p_new_free_record, kt_char_ptr_t * p_free_chain_returned,
                                       kt_char_ptr_t * p_previous_free_record_returned)
{
    record_t * const p_new            = head_at(p_new_free_record);
    kt_uint32_t      used_bytes_freed = p_new->record_length - RG_I_RECORD_HEAD_LENGTH;

    kt_char_ptr_t p_previous = nullptr;
    kt_char_ptr_t p_next     = *p_free_chain_returned;
    while (p_next != nullptr && p_next < p_new_free_record) {
        p_previous = p_next;
        p_next     = head_at(p_next)->p_next;
    }
    p_new->p_next = p_next;
    if (p_next != nullptr && p_new_free_record + p_new->record_length == p_next) {
        p_new->record_length += head_at(p_next)->record_length;
        p_new->p_next = head_at(p_next)->p_next;
        used_bytes_freed += RG_I_RECORD_HEAD_LENGTH;
    }
    *p_previous_free_record_returned = p_previous;
    if (p_previous == nullptr) {
        *p_free_chain_returned = p_new_free_record;
    } else if (p_previous + head_at(p_previous)->record_length == p_new_free_record) {
        head_at(p_previous)->record_length += p_new->record_length;
        head_at(p_previous)->p_next = p_new->p_next;
        used_bytes_freed += RG_I_RECORD_HEAD_LENGTH;
    } else {
        head_at(p_previous)->p_next = p_new_free_record;
    }
    return used_bytes_freed;
}

kt_int32_t rg_i_reserve_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t length, kt_uint32_t type,
                               kt_char_ptr_t * p_record_data)
{
    kt_char_ptr_t p_previous    = nullptr;
    kt_uint32_t   actual_length = 0;
    if (const kt_int32_t rc =
            rg_i_rb_find_suitable_record(p_record_buffer_pool, length, p_record_data, &p_previous, &actual_length);
        rc != 0)
        return rc;
    return rg_i_rb_allocate_record(p_record_buffer_pool, *p_record_data, p_previous, length, type);
}

kt_int32_t rg_i_rb_lend_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t data_length,
                               kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
                               kt_uint32_t * actual_data_length)
{
    return rg_i_rb_find_suitable_record(p_record_buffer_pool, data_length, p_data, p_previous_free_record,
                                        actual_data_length);
}

kt_int32_t rg_i_rb_take_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                               kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length, kt_uint32_t record_type)
{
    return rg_i_rb_allocate_record(p_record_buffer_pool, p_data, p_previous_free_record, data_length, record_type);
}

void rg_i_rb_give_back_record(rg_i_record_buffer_pool_t *, kt_char_ptr_t, kt_uint32_t) {}

kt_int32_t rg_i_rb_duplicate_record_buffer_pool(rg_i_record_buffer_pool_t * p_from, rg_i_record_buffer_pool_t * p_to,
                                                rg_i_record_buffer_pool_duplication_map_t ** p_duplication_map)
{
    auto * const p_map = static_cast<rg_i_record_buffer_pool_duplication_map_t *>(
        std::calloc(1, sizeof(rg_i_record_buffer_pool_duplication_map_t)));
    if (p_map == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    for (block_t * p_block = p_from->p_first_record_buffer; p_block != nullptr; p_block = p_block->p_next)
        ++p_map->total;
    const kt_uint32_t heads_saved = (p_map->total - 1) * RG_I_RECORD_BUFFER_HEAD_LENGTH;
    *p_to                         = {};
    p_to->total_bytes             = p_from->total_bytes - heads_saved;
    p_to->used_bytes              = p_from->used_bytes - heads_saved;

    const std::size_t count = std::max<std::size_t>(p_map->total, 1);
    p_map->p_begin          = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    p_map->p_end            = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    p_map->p_offset         = static_cast<kt_int32_t *>(std::malloc(count * sizeof(kt_int32_t)));
    p_map->p_to             = static_cast<kt_char_ptr_t *>(std::malloc(count * sizeof(kt_char_ptr_t)));
    auto * const p_block    = static_cast<block_t *>(std::calloc(1, p_to->total_bytes));
    if (p_map->p_begin == nullptr || p_map->p_end == nullptr || p_map->p_offset == nullptr || p_map->p_to == nullptr ||
        p_block == nullptr) {
        std::free(p_block);
        rg_i_rb_free_duplication_map(p_map);
        return rg_i_fail_no_memory(RG_HERE);
    }
    p_block->total_bytes        = p_to->total_bytes;
    kt_char_ptr_t p_destination = reinterpret_cast<kt_char_ptr_t>(p_block) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
    kt_uint32_t   i             = 0;
    for (block_t * p_source = p_from->p_first_record_buffer; p_source != nullptr; p_source = p_source->p_next, ++i) {
        p_map->p_begin[i]  = reinterpret_cast<kt_char_ptr_t>(p_source) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
        p_map->p_end[i]    = reinterpret_cast<kt_char_ptr_t>(p_source) + p_source->total_bytes;
        p_map->p_to[i]     = p_destination;
        p_map->p_offset[i] = static_cast<kt_int32_t>(static_cast<kt_uint32_t>(
            reinterpret_cast<std::uintptr_t>(p_destination) - reinterpret_cast<std::uintptr_t>(p_map->p_begin[i])));
        const auto length  = static_cast<std::size_t>(p_map->p_end[i] - p_map->p_begin[i]);
        std::memcpy(p_destination, p_map->p_begin[i], length);
        p_destination += length;
    }
    p_to->p_first_record_buffer = p_to->p_last_record_buffer = p_block;
    p_to->p_free_chain = rg_i_rb_map_duplicated_address(p_map, p_from->p_free_chain);
    for (kt_char_ptr_t p = p_to->p_free_chain; p != nullptr; p = head_at(p)->p_next)
        head_at(p)->p_next = rg_i_rb_map_duplicated_address(p_map, head_at(p)->p_next);
    *p_duplication_map = p_map;
    return 0;
}

kt_char_ptr_t rg_i_rb_map_duplicated_address(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map,
                                             kt_char_ptr_t                               p_from)
{
    for (kt_uint32_t i = 0; i < p_duplication_map->total; ++i)
        if (p_duplication_map->p_begin[i] <= p_from && p_from < p_duplication_map->p_end[i])
            return p_duplication_map->p_to[i] + (p_from - p_duplication_map->p_begin[i]);
    return nullptr;
}

kt_int32_t rg_i_rb_free_duplication_map(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map)
{
    if (p_duplication_map == nullptr)
        return 0;
    std::free(p_duplication_map->p_begin);
    std::free(p_duplication_map->p_end);
    std::free(p_duplication_map->p_offset);
    std::free(p_duplication_map->p_to);
    std::free(p_duplication_map);
    return 0;
}
