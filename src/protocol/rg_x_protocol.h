// SPDX-License-Identifier: MIT
// rg_x_protocol: tables as client values of the value library, in both directions.
//
// Packing presents a table as four client values, which the value library then measures and lays into the buffer;
// unpacking gets the same values back and makes a table of them. What the values hold is told in
// docs/PACKED-FORMAT.md.
#pragma once

#include "protocol/rg_i_packed_format.h"
#include "rg_i_table.h"

// ---- Presenting a table (rg_i_packed_metadata, rg_i_packed_row_arrays; read lock) -----------------------------------
//
// Each makes one client value and delivers it through its last argument, which is untouched after a failure. Names and
// rows aren't copied: the values point into the table and are good while its lock is held.

// Released by free.
[[nodiscard]] kt_int32_t rg_i_get_table_fixed_metadata_SD(rg_i_table_t * p_table,
                                                          kt_uint32_t    uncommitted_updates_visible,
                                                          kt_sd_ptr_t *  p_fixed_metadata_SD);
// Released by rg_i_free_packed_table_column_metadata_array. RG_E_INTERNAL if a structured data definition leaves the
// metadata record.
[[nodiscard]] kt_int32_t rg_i_get_table_column_metadata_array(rg_i_table_t *   p_table,
                                                              kt_uint32_t      uncommitted_updates_visible,
                                                              kt_array_ptr_t * p_column_metadata_array);
// Released by free, as the next one. Rows in the order of the fixed index.
[[nodiscard]] kt_int32_t rg_i_get_table_row_array(rg_i_table_t * p_table, kt_uint32_t uncommitted_updates_visible,
                                                  kt_array_ptr_t * p_row_array);
// Rows in the order of the indices. RG_E_ROW_DELETED for an index without a record in the role asked for.
[[nodiscard]] kt_int32_t rg_i_get_table_row_array_by_fixed_index(rg_i_table_t *   p_table,
                                                                 kt_uint32_t      uncommitted_updates_visible,
                                                                 kt_uint32_t      total_row_fixed_indices,
                                                                 kt_uint32_t *    p_row_fixed_indices,
                                                                 kt_array_ptr_t * p_row_array);
// NULL is accepted, and an array whose later elements aren't made yet.
void rg_i_free_packed_table_column_metadata_array(kt_array_ptr_t pColDefsArray);

// ---- Looking into a buffer (rg_x_get_packed_tables) ----------------------------------------------------------------

// RG_E_NULL_POINTER, or RG_E_LIBRARY_CALL for a length that is below the fixed part.
[[nodiscard]] kt_int32_t rg_i_open_packed_buffer(void * p_buffer, rg_i_packed_buffer_t * p_look);
// RG_E_NO_SUCH_INDEX, which 0xFFFFFFFF never gets.
[[nodiscard]] kt_int32_t rg_i_check_packed_table_index(const rg_i_packed_buffer_t & buffer, kt_uint32_t table_index);

// ---- Making a table of them (rg_x_unpack_table) --------------------------------------------------------------------

// Columns made of the metadata in a buffer. Names and defaults go on pointing into the client value. The columns are
// released by rg_i_free_unpacked_column_definitions.
[[nodiscard]] kt_int32_t rg_i_unpack_column_definitions(kt_array_ptr_t p_column_metadata_array,
                                                        kt_uint32_t * p_total_columns, rg_column_t ** p_p_columns);
void                     rg_i_free_unpacked_column_definitions(rg_column_t * p_columns, kt_uint32_t total_columns);
