// SPDX-License-Identifier: MIT
// rg_i_change_entries: see rg_i_change_entries.h.
//
// Layer: table. Calls the heap.
// Always holds: the newest chunk is the first of the chain and the only one with room.
// Locking: the table's write lock.
// Failure: a chunk that can't be had leaves everything as it was.
#include "table/rg_i_change_entries.h"

#include <algorithm>
#include <cstddef>
#include <cstdlib>

struct rg_i_change_chunk_t {
    rg_i_change_chunk_t * p_older;
    kt_uint32_t           capacity;
    kt_uint32_t           taken;
};

namespace
{

constexpr kt_uint32_t first_capacity = 16;
constexpr kt_uint32_t most_capacity  = 32768; // just under 1 MiB

rg_i_change_entry_t * entries_of(rg_i_change_chunk_t * p_chunk)
{
    return reinterpret_cast<rg_i_change_entry_t *>(p_chunk + 1);
}

[[nodiscard]] bool add_chunk(rg_i_table_t * p_table)
{
    rg_i_change_chunk_t * const p_older = p_table->p_change_chunks;
    const kt_uint32_t capacity = p_older == nullptr ? first_capacity : std::min(2 * p_older->capacity, most_capacity);
    auto * const      p_chunk  = static_cast<rg_i_change_chunk_t *>(
        std::malloc(sizeof(rg_i_change_chunk_t) + capacity * sizeof(rg_i_change_entry_t)));
    if (p_chunk == nullptr)
        return false;
    *p_chunk                 = {p_older, capacity, 0};
    p_table->p_change_chunks = p_chunk;
    return true;
}

} // namespace

rg_i_change_entry_t * rg_i_take_change_entry(rg_i_table_t * p_table)
{
    const rg_i_change_chunk_t * p_newest = p_table->p_change_chunks;
    if ((p_newest == nullptr || p_newest->taken == p_newest->capacity) && !add_chunk(p_table))
        return nullptr;
    rg_i_change_chunk_t * const p_chunk = p_table->p_change_chunks;
    return entries_of(p_chunk) + p_chunk->taken++;
}

kt_uint32_t rg_i_count_change_entries(const rg_i_table_t * p_table)
{
    kt_uint32_t count = 0;
    for (const rg_i_change_chunk_t * p_chunk = p_table->p_change_chunks; p_chunk != nullptr; p_chunk = p_chunk->p_older)
        count += p_chunk->taken;
    return count;
}

void rg_i_free_change_entries(rg_i_table_t * p_table)
{
    while (p_table->p_change_chunks != nullptr) {
        rg_i_change_chunk_t * const p_older = p_table->p_change_chunks->p_older;
        std::free(p_table->p_change_chunks);
        p_table->p_change_chunks = p_older;
    }
}
