// SPDX-License-Identifier: MIT
// rg_i_delete_columns: builds the table that is left when columns are deleted.
//
// Layer: schema. The work is a selection of all rows with the columns that stay.
// Always holds: the key stays, so that at least one column does.
// Locking: the caller holds the table's write lock.
// Failure: nothing is left of the new table; the old one isn't touched at any time.
#include <cstdlib>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rows/rg_i_arguments.h"
#include "rows/rg_i_row_lists.h"
#include "schema/rg_i_column_changes.h"

namespace
{

constexpr char module_version[] = "rg_i_delete_columns 1.0";

[[nodiscard]] bool can_be_deleted(const rg_i_table_t * p_table, kt_uint32_t column)
{
    return column != 0 && column != p_table->total_columns &&
           (p_table->p_columns[column].qualifier & RG_INVISIBLE) == 0;
}

// Each name must be that of another column that may go: so no more than all columns but the key are named.
[[nodiscard]] kt_int32_t check_names(const rg_i_table_t * p_table, kt_char_ptr_t * column_names,
                                     kt_uint32_t array_count)
{
    for (kt_uint32_t i = 0; i < array_count; ++i) {
        if (column_names[i] == nullptr)
            return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
        if (!can_be_deleted(p_table, rg_i_find_column(p_table, column_names[i])) ||
            rg_i_find_argument(column_names, i, column_names[i]) != i)
            return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    }
    return 0;
}

// Lists the names of the columns that stay, and returns how many they are: with a damaged file one name can take several
// columns away.
[[nodiscard]] kt_uint32_t list_columns_that_stay(const rg_i_table_t * p_table, kt_char_ptr_t * column_names,
                                                 kt_uint32_t array_count, kt_char_ptr_t * p_staying)
{
    kt_uint32_t total_staying = 0;
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        kt_char_ptr_t p_name = p_table->p_columns[column].name;
        if (rg_i_find_argument(column_names, array_count, p_name) == array_count)
            p_staying[total_staying++] = p_name;
    }
    return total_staying;
}

} // namespace

kt_int32_t rg_i_delete_columns(rg_i_table_t * p_table, kt_char_ptr_t * column_names, kt_uint32_t array_count,
                               rg_i_table_t ** p_p_result_table)
{
    if (column_names == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (array_count == 0)
        return rg_i_fail(RG_HERE, RG_E_NO_COLUMNS);
    if (const kt_int32_t rc = rg_i_check_columns_can_change(RG_HERE, p_table); rc != 0)
        return rc;
    if (array_count > p_table->total_columns - 1)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);

    const owned_ptr<kt_char_ptr_t> staying(static_cast<kt_char_ptr_t *>(
        std::malloc(size_t{p_table->total_columns - array_count} * sizeof(kt_char_ptr_t))));
    if (!staying)
        return rg_i_fail_no_memory(RG_HERE);
    if (const kt_int32_t rc = check_names(p_table, column_names, array_count); rc != 0)
        return rc;

    const kt_uint32_t total_staying = list_columns_that_stay(p_table, column_names, array_count, staying.get());
    rg_i_table_t *    p_new_table   = nullptr;
    if (const kt_int32_t rc = rg_i_select(p_table, staying.get(), total_staying, nullptr, &p_new_table); rc != 0)
        return rc;
    --p_new_table->change_counter; // the selection counted a change; this one counts when it is complete
    *p_p_result_table = p_new_table;
    return 0;
}
