// SPDX-License-Identifier: MIT
// rg_x_change_column_name: the exported call that renames a column.
//
// Layer: schema, exported.
#include "schema/rg_x_column_changes.h"

namespace
{

constexpr char module_version[] = "rg_x_change_column_name 1.0";

} // namespace

extern "C" kt_int32_t rg_change_column_name_1(rg_opaque_handle_t table_handle, kt_char_ptr_t column_name,
                                              kt_char_ptr_t new_name)
{
    const rg_i_site_t site = RG_HERE;
    return rg_i_column_change_call<entry_id::change_column_name>(
        site, table_handle, [&](rg_i_table_t & table, rg_i_table_t ** p_p_new_table) {
            if (new_name == nullptr)
                return rg_i_fail(site, RG_E_NULL_POINTER);
            return rg_i_update_metadata(&table, nullptr, 0, column_name, new_name, nullptr, p_p_new_table);
        });
}
