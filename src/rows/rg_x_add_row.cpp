// SPDX-License-Identifier: MIT
// rg_x_add_row: the exported call that adds a row.
//
// Layer: frame over rows. The frame takes the locks, tests the mode and completes implicitly; rg_i_add_row does the
// work.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_add_row 1.0";

} // namespace

kt_int32_t rg_add_row_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_fields,
                        kt_uint32_t total_values)
{
    return rg_i_updating_call<entry_id::add_row>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_add_row(&table, p_column_names, p_p_fields, total_values);
    });
}
