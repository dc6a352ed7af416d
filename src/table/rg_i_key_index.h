// SPDX-License-Identifier: MIT
// rg_i_key_index: leads to the row that a walk over all keys would find, for tables without a hash table.
//
// Such tables are defined by two walks: a lookup goes through the packed index and takes the first row whose committed,
// or else applied, record has the key; the test for a duplicate goes through the slots. The index gives their outcomes
// and no others. Where it can't tell what a walk would find it says so, and the walk is made.
//
// A table gets one when the walks that were made have cost several times what it takes to make it. It is memory beside
// the table that nothing depends on: without memory for it, the table goes on without.
#pragma once

#include "rg_i_table.h"

struct rg_i_key_index_t;

enum class rg_i_key_answer {
    unknown, // only the walk can tell
    absent,
    present
};

// What a lookup's walk would find. Read lock.
[[nodiscard]] rg_i_key_answer rg_i_key_index_find(const rg_i_table_t * p_table, const kt_value_t & key,
                                                  kt_uint32_t * p_fixed_row_index);
// What the walk of an add would find, whose new slot has its record already. Write lock.
[[nodiscard]] rg_i_key_answer rg_i_key_index_find_duplicate(rg_i_table_t * p_table, const kt_value_t & key,
                                                            kt_uint32_t new_slot);

// A walk has looked at so many rows. May make the index. An add's new slot has its record already, but its row isn't
// counted yet. Read or write lock.
void rg_i_key_index_note_walk(rg_i_table_t * p_table, kt_uint32_t rows_visited, kt_uint32_t uncounted_rows);
// A slot that had no record has one. Write lock.
void rg_i_key_index_note_record(rg_i_table_t * p_table, kt_uint32_t slot);
// A slot's record is about to be another one, perhaps with another key. Write lock.
void rg_i_key_index_note_replacement(rg_i_table_t * p_table, kt_uint32_t slot, kt_char_ptr_t p_former_record,
                                     kt_char_ptr_t p_record);
// The slots are about to be others, or to go. Write lock.
void rg_i_key_index_drop(rg_i_table_t * p_table);
