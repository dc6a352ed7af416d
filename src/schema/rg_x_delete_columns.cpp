// SPDX-License-Identifier: MIT
// rg_x_delete_columns: the exported call that deletes columns of a table.
//
// Layer: schema, exported.
#include "schema/rg_x_column_changes.h"

namespace
{

constexpr char module_version[] = "rg_x_delete_columns 1.0";

} // namespace

extern "C" kt_int32_t rg_delete_columns_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * column_names,
                                          kt_uint32_t array_count)
{
    return rg_i_column_change_call<entry_id::delete_columns>(
        RG_HERE, table_handle, [&](rg_i_table_t & table, rg_i_table_t ** p_p_new_table) {
            const kt_int32_t rc = rg_i_delete_columns(&table, column_names, array_count, p_p_new_table);
            if (rc == 0)
                (*p_p_new_table)->mode = table.mode; // a selection has one of its own
            return rc;
        });
}
