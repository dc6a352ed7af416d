// SPDX-License-Identifier: MIT
// rg_i_column_changes: changes of a table's columns.
//
// A column change doesn't edit the table. A builder makes a second table in memory with the new columns and all rows,
// a table with a file is rewritten from it, and then the two objects exchange their contents, so that the handles on
// the old one show the new columns. An overlay edits the definition in memory and nothing else. The caller holds the
// table's write lock for all of them, and ForkMutex.
#pragma once

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"

// ---- Builders (rg_i_update_metadata, rg_i_delete_columns): the old table stays as it is ----

// Adds the new columns if there are any; renames a column, or gives it another default if p_new_column_name is NULL.
// Without p_old_column_name the columns that are there stay as they are.
[[nodiscard]] kt_int32_t rg_i_update_metadata(rg_i_table_t * p_table, rg_column_t * p_new_columns,
                                              kt_uint32_t total_new_columns, kt_char_ptr_t p_old_column_name,
                                              kt_char_ptr_t p_new_column_name, kt_value_t * p_new_value,
                                              rg_i_table_t ** p_result_table);
[[nodiscard]] kt_int32_t rg_i_delete_columns(rg_i_table_t * p_table, kt_char_ptr_t * column_names,
                                             kt_uint32_t array_count, rg_i_table_t ** p_p_result_table);

// What every builder asks of the table: open for writing, and nothing pending or applied.
[[nodiscard]] inline kt_int32_t rg_i_check_columns_can_change(const rg_i_site_t & site, const rg_i_table_t * p_table)
{
    if ((p_table->mode & RG_MODE_WRITE) == 0)
        return rg_i_fail(site, RG_E_ACCESS);
    if (p_table->ready_for_commit != 0 || p_table->p_rows_change_list != nullptr ||
        p_table->p_delete_rows_change_list != nullptr)
        return rg_i_fail(site, RG_E_UNCOMMITTED_TABLE);
    return 0;
}

// ---- The end of every change (rg_i_take_new_columns) ----

// Makes what was built the table's contents: through the table's file if it has one. The new object is closed, whatever
// the code.
[[nodiscard]] kt_int32_t rg_i_take_new_columns(rg_i_table_t * p_table, rg_i_table_t * p_new_table);

// ---- Overlays (rg_i_overlay_memory) ----

[[nodiscard]] kt_int32_t rg_i_overlay_memory_default_value(rg_i_table_t * p_table, kt_char_ptr_t p_column_name,
                                                           kt_value_t new_default_value);
[[nodiscard]] kt_int32_t rg_i_overlay_memory_column_qualifier(rg_i_table_t * p_table, kt_char_ptr_t p_column_name,
                                                              rg_qualifier_t new_qualifier);
