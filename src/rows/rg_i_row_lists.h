// SPDX-License-Identifier: MIT
// rg_i_row_lists: finding rows: as a table of their own (rg_i_select), or as a list of fixed indices (rg_i_row_lists).
// A list is an allocation that the caller of the library frees.
#pragma once

#include "rg_i_table.h"

// The caller holds the table's lock for reading.
[[nodiscard]] kt_int32_t rg_i_select(rg_i_table_t * p_table, kt_char_ptr_t * p_column_names,
                                     kt_uint32_t total_column_names, kt_char_ptr_t p_selection_criteria,
                                     rg_i_table_t ** p_select_table);
// p_column_indices NULL: all columns.
[[nodiscard]] kt_int32_t rg_i_copy_row(rg_i_table_t * p_table, kt_char_ptr_t p_from_record_data,
                                       rg_i_table_t * p_new_table, kt_uint32_t * p_column_indices);
[[nodiscard]] kt_int32_t rg_i_get_selected_rows(rg_i_table_t * p_table, kt_char_ptr_t p_selection_criteria,
                                                kt_uint32_t    uncommitted_updates_visible,
                                                kt_uint32_t *  p_total_selected_rows,
                                                kt_uint32_t ** p_p_selected_rows_fixed_index);
[[nodiscard]] kt_int32_t rg_i_get_updated_rows(rg_i_table_t * p_table, kt_uint32_t * p_updated_rows_count,
                                               kt_uint32_t ** p_p_updated_rows_fixed_indices);
[[nodiscard]] kt_int32_t rg_i_get_duplicate_rows(rg_i_table_t * p_table, kt_value_t key_value,
                                                 kt_uint32_t *  p_duplicate_rows_count,
                                                 kt_uint32_t ** p_p_duplicate_rows_fixed_indices,
                                                 kt_uint32_t    uncommitted_updates_visible);
