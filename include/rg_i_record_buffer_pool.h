// SPDX-License-Identifier: MIT
// rg_i_record_buffer_pool: the allocator in which a table's metadata record and all its row records live.
//
// First fit in address order, with coalescing, and an exact count of the bytes in use, which the rewrite decision is
// made from. Allocation is in two steps: a caller is lent a whole free record to build in, and takes what it used.
// Between the two nothing else may touch the pool. No lock: the table's write lock covers every use.
//
// Everywhere a pointer to a record is the address of its data, RG_I_RECORD_HEAD_LENGTH bytes behind its head.
#pragma once

#include <cstddef>
#include <cstring>
#include <type_traits>

#include "kt_types.h"

// What a record is, in memory and on disk. On disk, never renumber.
enum : kt_uint32_t {
    RG_RECORD_TYPE_FREE         = 0,
    RG_RECORD_TYPE_METADATA     = 1,
    RG_RECORD_TYPE_ROW          = 2,
    RG_RECORD_TYPE_DELETED_ROWS = 3,
    RG_RECORD_TYPE_COMMIT       = 0xFFFFFFFFu
};

#pragma pack(push, 1)

// One block from the heap. Records tile it without gaps from byte 12 to byte total_bytes.
struct rg_i_record_buffer_t {
    rg_i_record_buffer_t * p_next;      // bytes 0-7: next block of the pool
    kt_uint32_t            total_bytes; // bytes 8-11: size of the block, this head included
};

// The head of every record.
struct rg_i_record_metadata_t {
    kt_uint32_t   record_length;     // bytes 0-3: length of the record, this head included
    kt_char_ptr_t p_next;            // bytes 4-11: while free, the next free record's head; stale once allocated
    kt_uint32_t   type;              // bytes 12-15: RG_RECORD_TYPE_...
    kt_uint32_t   disk_table_offset; // bytes 16-19: file offset, stamped by apply and open; the pool doesn't use it
};

#pragma pack(pop)

inline constexpr kt_uint32_t RG_I_RECORD_BUFFER_HEAD_LENGTH = 12;
inline constexpr kt_uint32_t RG_I_RECORD_HEAD_LENGTH        = 20;
// Bytes behind a record that may be read. A record is packed as a binary whose length word counts itself, so packing
// copies four bytes more than the record has. Behind the last record of a block they are zero.
inline constexpr kt_uint32_t RG_I_RECORD_OVERHANG = 4;

static_assert(sizeof(rg_i_record_buffer_t) == RG_I_RECORD_BUFFER_HEAD_LENGTH);
static_assert(offsetof(rg_i_record_buffer_t, total_bytes) == 8);
static_assert(sizeof(rg_i_record_metadata_t) == RG_I_RECORD_HEAD_LENGTH);
static_assert(offsetof(rg_i_record_metadata_t, p_next) == 4 && offsetof(rg_i_record_metadata_t, type) == 12 &&
              offsetof(rg_i_record_metadata_t, disk_table_offset) == 16);
static_assert(std::is_trivially_copyable_v<rg_i_record_metadata_t>);

struct rg_i_free_record_index_t; // leads to a place in the free chain without walking it
struct rg_i_kept_blocks_t;       // blocks that live as long as somebody needs them

// A pool of zero bytes is an empty pool.
struct rg_i_record_buffer_pool_t {
    kt_uint32_t                total_bytes;  // of all blocks
    kt_uint32_t                used_bytes;   // heads of blocks, heads of all records, data of allocated records
    kt_char_ptr_t              p_free_chain; // head of the first free record; ascending address order
    rg_i_record_buffer_t *     p_first_record_buffer; // first block
    rg_i_record_buffer_t *     p_last_record_buffer;  // last block
    rg_i_free_record_index_t * p_free_index;          // stands behind the first block; NULL while the pool has no block
    rg_i_kept_blocks_t *       p_kept_blocks;         // what shares the blocks with pools that lead into them, or NULL
    rg_i_kept_blocks_t *       p_lender;              // the blocks that records of this pool lead into, or NULL
    kt_char_ptr_t              p_lent_metadata;       // the metadata record there that the names of this one lie in
    kt_char_ptr_t *            p_gathered;            // records to be freed together, while rg_i_rb_gather_frees is on
    kt_uint32_t                gathered;
    kt_uint32_t                most_gathered;
};

static_assert(offsetof(rg_i_record_buffer_pool_t, p_free_chain) == 8 &&
              offsetof(rg_i_record_buffer_pool_t, p_last_record_buffer) == 24);

// How the addresses in one pool map to its copy: one array element per source block.
struct rg_i_record_buffer_pool_duplication_map_t {
    kt_uint32_t     total;        // source blocks
    kt_char_ptr_t * p_begin;      // first byte behind each block's head
    kt_char_ptr_t * p_end;        // first byte behind each block
    kt_int32_t *    p_offset;     // destination minus source, cut to 32 bits
    kt_char_ptr_t * p_to;         // where each block's first byte went: right at any distance
    kt_uint32_t *   p_by_address; // numbers of the blocks in ascending address order
    kt_uint32_t     recent;       // the block that an address was last found in
};

[[nodiscard]] inline rg_i_record_metadata_t * rg_i_record_head(kt_char_ptr_t p_data)
{
    return reinterpret_cast<rg_i_record_metadata_t *>(p_data - RG_I_RECORD_HEAD_LENGTH);
}

[[nodiscard]] inline const rg_i_record_metadata_t * rg_i_record_head(const kt_char_t * p_data)
{
    return reinterpret_cast<const rg_i_record_metadata_t *>(p_data - RG_I_RECORD_HEAD_LENGTH);
}

// Bytes of data that the record holds.
[[nodiscard]] inline kt_uint32_t rg_i_record_data_length(const kt_char_t * p_data)
{
    return rg_i_record_head(p_data)->record_length - RG_I_RECORD_HEAD_LENGTH;
}

[[nodiscard]] kt_int32_t rg_i_rb_initialize_record_buffer_pool(kt_uint32_t                 total_pages,
                                                               rg_i_record_buffer_pool_t * p_record_buffer_pool);
kt_int32_t               rg_i_rb_uninitialize_record_buffer_pool(rg_i_record_buffer_pool_t * p_record_buffer_pool);

// Lends a free record of at least data_length bytes, all zero. Nothing is taken until rg_i_rb_allocate_record.
[[nodiscard]] kt_int32_t rg_i_rb_find_suitable_record(rg_i_record_buffer_pool_t * p_record_buffer_pool,
                                                      kt_uint32_t data_length, kt_char_ptr_t * p_data,
                                                      kt_char_ptr_t * p_previous_free_record,
                                                      kt_uint32_t *   actual_data_length);
[[nodiscard]] kt_int32_t rg_i_rb_allocate_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                                                 kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length,
                                                 kt_uint32_t record_type);
kt_int32_t               rg_i_rb_free_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data);
// Between the two, what rg_i_rb_free_record is given stays as it is, and then goes in the order of addresses: the same
// outcome, but neighbours go one after the other instead of each being looked for anywhere in memory. Nothing may be
// allocated meanwhile. Without memory for so many addresses, or for few of them, each record goes at once.
void        rg_i_rb_gather_frees(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t expected);
void        rg_i_rb_free_gathered(rg_i_record_buffer_pool_t * p_record_buffer_pool);
kt_uint32_t rg_i_rb_insert_free_record(kt_char_ptr_t p_new_free_record, kt_char_ptr_t * p_free_chain_returned,
                                       kt_char_ptr_t * p_previous_free_record_returned);
// Find and allocate in one, for a length known beforehand. The data is all zero.
[[nodiscard]] kt_int32_t rg_i_reserve_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t length,
                                             kt_uint32_t type, kt_char_ptr_t * p_record_data);

// The same two steps for builders that write every byte they take (rows): the room is handed out as it is, so that the
// cost doesn't grow with the free record, and only what is taken beyond data_length is zeroed.
//
// A builder that gives up after writing into the lent room, or takes less than it wrote, must say how far it wrote with
// rg_i_rb_give_back_record: the pool relies on the rest still being zero.
[[nodiscard]] kt_int32_t rg_i_rb_lend_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_uint32_t data_length,
                                             kt_char_ptr_t * p_data, kt_char_ptr_t * p_previous_free_record,
                                             kt_uint32_t * actual_data_length);
[[nodiscard]] kt_int32_t rg_i_rb_take_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                                             kt_char_ptr_t p_previous_free_record, kt_uint32_t data_length,
                                             kt_uint32_t record_type);
void rg_i_rb_give_back_record(rg_i_record_buffer_pool_t * p_record_buffer_pool, kt_char_ptr_t p_data,
                              kt_uint32_t bytes_written);

[[nodiscard]] kt_int32_t
              rg_i_rb_duplicate_record_buffer_pool(rg_i_record_buffer_pool_t * p_from, rg_i_record_buffer_pool_t * p_to,
                                                   rg_i_record_buffer_pool_duplication_map_t ** p_duplication_map);
kt_char_ptr_t rg_i_rb_map_duplicated_address(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map,
                                             kt_char_ptr_t                               p_from);
kt_int32_t    rg_i_rb_free_duplication_map(rg_i_record_buffer_pool_duplication_map_t * p_duplication_map);

// ---- Blocks that others lead into ----
//
// The records of a table copied in memory lead into records of its source. So the pool of the source shares its blocks:
// they live until the pool is gone and every holder has let go of them. Counts change from any thread.

// Counts one more holder of the pool's blocks. Failure: RG_E_NO_MEMORY, and nothing changed.
[[nodiscard]] kt_int32_t rg_i_rb_share_blocks(rg_i_record_buffer_pool_t * p_record_buffer_pool,
                                              rg_i_kept_blocks_t **       p_p_kept_blocks);
// One more holder of blocks that are shared already.
void rg_i_rb_hold_blocks(rg_i_kept_blocks_t * p_kept_blocks);
// NULL is accepted.
void rg_i_rb_let_go_of_blocks(rg_i_kept_blocks_t * p_kept_blocks);
// What becomes of the blocks of a pool that goes: freed, or left to those who hold them.
void rg_i_rb_give_up_blocks(rg_i_record_buffer_pool_t * p_record_buffer_pool);
