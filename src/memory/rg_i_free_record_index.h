// SPDX-License-Identifier: MIT
// rg_i_free_record_index: leads to the places of a pool's free chain that walking the chain would lead to.
//
// The chain itself stays what it is: records linked in ascending address order. Beside it each block carries, behind
// its last record and in the same heap block, a summary of the free records that start in it, and the blocks form a
// tree by address. So neither a search nor the return of a record costs in proportion to the chain. All the room that
// the index needs comes with the blocks, so once a block is there, keeping the index can't fail.
//
// Used by the record pool alone. The pool links and unlinks the records, and tells the index what it did.
#pragma once

#include <cstddef>

#include "rg_i_record_buffer_pool.h"

struct rg_i_free_record_index_t;

// What a block carries behind its records. Segments are 1 KiB of the block each.
struct rg_i_block_index_t {
    rg_i_record_buffer_t *     p_block;
    rg_i_free_record_index_t * p_index;
    kt_uint32_t *              p_longest; // by segment, then by 16 segments, by 256 ...: no free record there is longer
    kt_uint16_t *              p_first;   // by segment: 1 + place in it of its first free record; 0: none starts there
    kt_uint32_t                segments;
    kt_uint32_t                bounds;     // entries of p_longest; the last one is for the whole block
    kt_uint32_t                clean_from; // from this byte of the block on, it is zero as it came from the heap
    kt_uint32_t                node;       // its place in the tree of blocks
    bool starts_heap_memory;               // its start is what the heap handed out, for it and the blocks carved behind
};

// A block in the tree of blocks, which is ordered by address. The nodes lie together, so that going down the tree
// touches little memory. Links are numbers of nodes; node 0 stands for none, and its bounds are 0.
struct rg_i_block_node_t {
    kt_char_ptr_t p_start;
    kt_uint32_t   total_bytes;
    kt_uint32_t   left;
    kt_uint32_t   right;
    kt_uint32_t   parent;
    kt_uint32_t   longest;            // no free record in the block is longer
    kt_uint32_t   longest_in_subtree; // nor in the blocks below
};

static_assert(sizeof(rg_i_block_node_t) == 32);

// A free record with its surroundings. No record: p_record is NULL.
struct rg_i_free_place_t {
    kt_char_ptr_t        p_record;
    kt_char_ptr_t        p_previous; // the free record before it in the chain; NULL: it is the first
    rg_i_block_index_t * p_block;
};

inline constexpr kt_uint32_t RG_I_FIRST_BLOCK_NODES = 4; // a pool of up to three blocks needs no memory for its tree

// The root, which stands behind the first block's own index.
struct rg_i_free_record_index_t {
    rg_i_block_node_t *  p_nodes; // first_nodes, or grown to an array of its own
    kt_uint32_t          node_count;
    kt_uint32_t          node_capacity;
    kt_uint32_t          root;
    kt_uint32_t          hint_length;
    rg_i_block_index_t * p_recent; // the block that an address was last found in
    kt_char_ptr_t        p_room;   // what is left of the memory that blocks are carved from
    std::size_t          room;
    std::size_t          heap_bytes; // of all blocks, with what stands behind them
    // Where the last search ended: every free record before it is shorter than hint_length. So a search for that length
    // or more can begin there, and a run of allocations from one free record doesn't search at all.
    rg_i_free_place_t hint;
    bool              hint_previous_known; // p_previous can get lost; p_block does when it is NULL
    rg_i_block_node_t first_nodes[RG_I_FIRST_BLOCK_NODES];
};

// Makes a block of total_bytes with room for the index behind, and enters it, without any free record. It is zeroed from
// clean_from on. A pool that has no index yet (*p_p_index is NULL) gets one with it. NULL: no memory, nothing changed.
[[nodiscard]] rg_i_block_index_t * rg_i_make_indexed_block(rg_i_free_record_index_t ** p_p_index,
                                                           kt_uint32_t                 total_bytes);
// Ahead of freeing the blocks: frees what the index has beside them. NULL is accepted.
void rg_i_drop_index(rg_i_free_record_index_t * p_index);
// Frees the blocks of a whole pool, from its first one on. NULL is accepted.
void rg_i_free_blocks(rg_i_record_buffer_t * p_first);

// The block that an address lies in, or NULL.
[[nodiscard]] rg_i_block_index_t * rg_i_block_of(rg_i_free_record_index_t * p_index, const kt_char_t * p_address);

// The first free record of at least that length, in address order.
[[nodiscard]] rg_i_free_place_t rg_i_first_fit(rg_i_free_record_index_t * p_index, kt_uint32_t record_length);
// The last free record that starts before the address, which lies in the block; NULL if there is none.
[[nodiscard]] kt_char_ptr_t rg_i_last_free_before(rg_i_block_index_t * p_block, const kt_char_t * p_address);
// The first free record of the block, or NULL.
[[nodiscard]] kt_char_ptr_t rg_i_first_free_in(rg_i_block_index_t * p_block);

// What the pool has done to the chain. The lengths are those that stand in the records now.
void rg_i_note_free(rg_i_block_index_t * p_block, kt_char_ptr_t p_record);
void rg_i_note_grown(rg_i_block_index_t * p_block, kt_char_ptr_t p_record);
// The record isn't free any more; p_next is what its link led to.
void rg_i_note_gone(rg_i_block_index_t * p_block, kt_char_ptr_t p_record, kt_char_ptr_t p_next);

// The same for the hint: a record was taken and p_rest (NULL: nothing) stands in its place, or p_record came into being
// or grew, with p_absorbed (or NULL) swallowed by it from behind. p_previous as the pool knows it.
void rg_i_move_hint_after_taking(rg_i_free_record_index_t * p_index, kt_char_ptr_t p_taken, kt_char_ptr_t p_previous,
                                 kt_char_ptr_t p_rest, kt_char_ptr_t p_next);
void rg_i_move_hint_after_freeing(rg_i_free_record_index_t * p_index, const rg_i_free_place_t & freed,
                                  bool previous_known, kt_char_ptr_t p_absorbed);
