// SPDX-License-Identifier: MIT
// rg_i_set_values: replaces columns of an existing row.
//
// Layer: rows. Stands on the row builder, the change lists and, for rows by key, the lookup of rg_i_get_values.
// Always holds: a record is never changed in place. Each update builds a whole new record from the row's applied one,
// whatever the visibility settings, so that two updates in a transaction build on each other; the committed record
// stays for readers and for abort. The row's slot, packed position and hash bucket don't change.
// Locking: the caller holds the table's write lock.
// Failure: the table is as it was, but for a pool block that may have been added.
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rows/rg_i_arguments.h"
#include "rows/rg_i_row_builder.h"
#include "table/rg_i_key_index.h"

namespace
{

constexpr char module_version[] = "rg_i_set_values 1.0";

// Stores what a column that the caller doesn't name gets: its present value, or its default if it is flagged so.
[[nodiscard]] kt_int32_t store_unnamed(rg_i_row_builder_t * p_row, kt_uint32_t column, kt_char_ptr_t p_from_record)
{
    const rg_i_table_t * p_table    = p_row->p_table;
    const rg_column_t &  definition = p_table->p_columns[column];
    if ((definition.qualifier & RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED) != 0)
        return rg_i_row_builder_carry_value(p_row, column, &definition.default_value, rg_i_default_data(p_table),
                                            rg_i_default_data_length(p_table), room_grows::by_the_length);
    return rg_i_row_builder_carry_value(p_row, column, rg_i_row_slot(p_from_record, column),
                                        rg_i_row_indirect_data(p_from_record, p_table->total_columns),
                                        rg_i_row_indirect_length(p_table, p_from_record), room_grows::by_the_length);
}

[[nodiscard]] kt_int32_t store_columns(rg_i_row_builder_t * p_row, kt_char_ptr_t p_from_record,
                                       kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                       kt_uint32_t total_values)
{
    const rg_i_table_t *   p_table                 = p_row->p_table;
    kt_uint32_t            input_columns_processed = 0;
    rg_i_argument_search_t arguments{p_column_names, total_values};
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        const rg_column_t & definition = p_table->p_columns[column];
        const kt_uint32_t   i          = arguments.find(definition.name);
        if (i == total_values) {
            if (const kt_int32_t rc = store_unnamed(p_row, column, p_from_record); rc != 0)
                return rc;
            continue;
        }
        if ((definition.qualifier & RG_PROTECTED) != 0)
            return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
        if (const kt_int32_t rc = rg_i_row_builder_store_value(p_row, column, p_p_values[i]); rc != 0)
            return rc;
        ++input_columns_processed;
    }
    // Kept because callers depend on it: the name that no column has, or that stands twice, gives RG_E_INVALID_COLUMN
    // here where adding gives RG_E_NO_COLUMNS.
    if (input_columns_processed != total_values)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    return 0;
}

// Puts the new record in the place of the row's applied one, which is released unless it is the committed one.
//
// Kept because callers depend on it: a changed key isn't tested for a duplicate, and the row stays in the hash bucket
// of its old key.
void replace_applied_record(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry, kt_char_ptr_t p_new_record)
{
    kt_char_ptr_t p_from_record = p_index_entry->p_applied;
    p_index_entry->p_applied    = p_new_record;
    rg_i_key_index_note_replacement(p_table, rg_i_fixed_row_index(p_table, p_index_entry), p_from_record, p_new_record);
    if (p_from_record == p_index_entry->p_committed)
        return;
    // The key of a row that isn't committed yet stands in the record that goes. The element of a committed row points
    // into the committed record until commit.
    if (p_index_entry->p_committed == nullptr && p_table->p_rows_hash_table != nullptr)
        p_index_entry->p_hash_table_element->p_key_value = rg_i_row_key(p_table, p_new_record);
    rg_i_rb_free_record(&p_table->record_buffer_pool, p_from_record);
}

} // namespace

kt_int32_t rg_i_set_values_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                           kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                           kt_uint32_t total_values)
{
    if (p_table->ready_for_commit != 0)
        return rg_i_fail(RG_HERE, RG_E_APPLIED_UNCOMMITTED);
    if (rg_i_any_argument_is_null(p_column_names, p_p_values, total_values))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (fixed_row_index >= p_table->maximum_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    rg_i_index_entry_t * p_index_entry = &p_table->p_rows_fixed_index[fixed_row_index];
    kt_char_ptr_t        p_from_record = p_index_entry->p_applied;
    if (p_from_record == nullptr)
        return rg_i_fail(RG_HERE, RG_E_ROW_DELETED);
    const kt_uint32_t from_length = rg_i_record_data_length(p_from_record);
    if (from_length > UINT32_MAX / 2)
        return rg_i_fail_no_memory(RG_HERE);

    rg_i_row_builder_t row;
    if (const kt_int32_t rc = rg_i_row_builder_open(&row, p_table, 2 * from_length); rc != 0)
        return rc;
    kt_int32_t rc = store_columns(&row, p_from_record, p_column_names, p_p_values, total_values);
    if (rc == 0)
        rc = rg_i_row_builder_take(&row, p_index_entry->file_offset); // 0 for a row that isn't committed yet
    if (rc != 0) {
        rg_i_row_builder_abandon(&row);
        return rc;
    }
    if (rc = rg_i_add_change_entry(p_table, p_index_entry); rc != 0) {
        rg_i_rb_free_record(&p_table->record_buffer_pool, row.p_record);
        return rc;
    }

    // Nothing below fails.
    replace_applied_record(p_table, p_index_entry, row.p_record);
    return 0;
}

kt_int32_t rg_i_set_value_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                          kt_char_ptr_t p_column_name, kt_value_t * p_value)
{
    return rg_i_set_values_for_fixed_index(p_table, fixed_row_index, &p_column_name, &p_value, 1);
}

kt_int32_t rg_i_set_values_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                            kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                            kt_uint32_t total_values)
{
    if (row_index >= p_table->total_applied_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    return rg_i_set_values_for_fixed_index(p_table, p_table->p_rows_packed_index[row_index], p_column_names, p_p_values,
                                           total_values);
}

kt_int32_t rg_i_set_value_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index, kt_char_ptr_t p_column_name,
                                           kt_value_t * p_value)
{
    return rg_i_set_values_for_packed_index(p_table, row_index, &p_column_name, &p_value, 1);
}

kt_int32_t rg_i_set_values_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t * p_column_names,
                                   kt_value_t ** p_p_values, kt_uint32_t total_values)
{
    kt_uint32_t fixed_row_index = 0;
    if (const kt_int32_t rc = rg_i_get_fixed_row_index_for_key(p_table, row_key, &fixed_row_index); rc != 0)
        return rc;
    return rg_i_set_values_for_fixed_index(p_table, fixed_row_index, p_column_names, p_p_values, total_values);
}

kt_int32_t rg_i_set_value_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t p_column_name,
                                  kt_value_t * p_value)
{
    return rg_i_set_values_for_key(p_table, row_key, &p_column_name, &p_value, 1);
}
