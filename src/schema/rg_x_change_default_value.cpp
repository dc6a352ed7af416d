// SPDX-License-Identifier: MIT
// rg_x_change_default_value: the exported calls that give a column another default: for good, or in this process only
// together with the overlay of its qualifier.
//
// Layer: schema, exported.
#include "schema/rg_x_column_changes.h"

namespace
{

constexpr char module_version[] = "rg_x_change_default_value 1.0";

} // namespace

extern "C" kt_int32_t rg_change_default_value_1(rg_opaque_handle_t table_handle, kt_char_ptr_t column_name,
                                                kt_value_t new_value)
{
    return rg_i_column_change_call<entry_id::change_default_value>(
        RG_HERE, table_handle, [&](rg_i_table_t & table, rg_i_table_t ** p_p_new_table) {
            return rg_i_update_metadata(&table, nullptr, 0, column_name, nullptr, &new_value, p_p_new_table);
        });
}

extern "C" kt_int32_t rg_overlay_memory_default_value_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_column_name,
                                                        kt_value_t new_default_value)
{
    return rg_i_column_call<entry_id::overlay_memory_default_value>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_overlay_memory_default_value(&table, p_column_name, new_default_value);
    });
}

extern "C" kt_int32_t rg_overlay_memory_column_qualifier_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_column_name,
                                                           rg_qualifier_t new_qualifier)
{
    return rg_i_column_call<entry_id::overlay_memory_column_qualifier>(
        RG_HERE, table_handle, [&](rg_i_table_t & table) {
            return rg_i_overlay_memory_column_qualifier(&table, p_column_name, new_qualifier);
        });
}
