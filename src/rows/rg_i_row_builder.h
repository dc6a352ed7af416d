// SPDX-License-Identifier: MIT
// rg_i_row_builder: a row record under construction, for adding and for setting fields.
//
// The record is built column by column in room that the pool lends. Columns are stored in order, so that the indirect
// data comes out packed; when the room runs out the record moves to bigger room with all that it holds. Nothing is
// taken from the pool until rg_i_row_builder_take. Whoever gives up calls rg_i_row_builder_abandon, so that the pool
// knows how far the lent room was written.
#pragma once

#include "rg_i_table.h"

struct rg_i_row_builder_t {
    rg_i_table_t * p_table;
    ku_iconv_t *   p_string_conversion_handle; // client strings to the table's encoding; NULL: as they are
    kt_uint32_t    fixed_length;               // bytes ahead of the indirect data
    kt_char_ptr_t  p_record;                   // NULL until room is lent
    kt_char_ptr_t  p_previous_free_record;
    kt_uint32_t    capacity;       // bytes of data that the room takes
    kt_uint32_t    running_offset; // bytes of indirect data so far
};

// Starts a record in room of at least so many bytes, which must cover the fixed part.
[[nodiscard]] kt_int32_t rg_i_row_builder_open(rg_i_row_builder_t * p_row, rg_i_table_t * p_table,
                                               kt_uint32_t wanted_length);
// Stores the caller's value, with room that doubles as often as it takes.
[[nodiscard]] kt_int32_t        rg_i_row_builder_store_indirect(rg_i_row_builder_t * p_row, kt_uint32_t column,
                                                                kt_value_t * p_client_value);
[[nodiscard]] inline kt_int32_t rg_i_row_builder_store_value(rg_i_row_builder_t * p_row, kt_uint32_t column,
                                                             kt_value_t * p_client_value)
{
    if (rg_i_type_is_indirect(p_row->p_table->p_columns[column].type))
        return rg_i_row_builder_store_indirect(p_row, column, p_client_value);
    // All eight bytes, whatever the type's width: the rest is whatever the union held.
    std::memcpy(rg_i_row_slot(p_row->p_record, column), p_client_value, sizeof *p_client_value);
    return 0;
}
// Stores a value that is in stored form already: a default, or the value of another record. Its slot may lie at any
// alignment; an item that leaves the source's indirect data is refused.
enum class room_grows { by_doubling, by_the_length };
[[nodiscard]] kt_int32_t        rg_i_row_builder_carry_indirect(rg_i_row_builder_t * p_row, kt_uint32_t column,
                                                                const void * p_slot, const kt_char_t * p_indirect_data,
                                                                kt_uint32_t indirect_length, room_grows growth);
[[nodiscard]] inline kt_int32_t rg_i_row_builder_carry_value(rg_i_row_builder_t * p_row, kt_uint32_t column,
                                                             const void * p_slot, const kt_char_t * p_indirect_data,
                                                             kt_uint32_t indirect_length, room_grows growth)
{
    if (rg_i_type_is_indirect(p_row->p_table->p_columns[column].type))
        return rg_i_row_builder_carry_indirect(p_row, column, p_slot, p_indirect_data, indirect_length, growth);
    std::memcpy(rg_i_row_slot(p_row->p_record, column), p_slot, sizeof(kt_pmsg_value_t));
    return 0;
}
// Takes the record from the pool.
[[nodiscard]] kt_int32_t rg_i_row_builder_take(rg_i_row_builder_t * p_row, kt_uint32_t replaces_offset);
void                     rg_i_row_builder_abandon(rg_i_row_builder_t * p_row);
