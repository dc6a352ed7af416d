// SPDX-License-Identifier: MIT
// rg_x_add_columns: the exported call that adds columns to a table.
//
// Layer: schema, exported.
#include "schema/rg_x_column_changes.h"

namespace
{

constexpr char module_version[] = "rg_x_add_columns 1.0";

} // namespace

extern "C" kt_int32_t rg_add_columns_1(rg_opaque_handle_t table_handle, rg_column_t * columns, kt_uint32_t array_count)
{
    const rg_i_site_t site = RG_HERE;
    return rg_i_column_change_call<entry_id::add_columns>(
        site, table_handle, [&](rg_i_table_t & table, rg_i_table_t ** p_p_new_table) {
            // Kept because callers depend on it: no columns at all make a plain rebuild.
            if (columns == nullptr && array_count != 0)
                return rg_i_fail(site, RG_E_NULL_POINTER);
            return rg_i_update_metadata(&table, columns, array_count, nullptr, nullptr, nullptr, p_p_new_table);
        });
}
