// SPDX-License-Identifier: MIT
// rg_x_set_field: the exported calls that set one field of a row.
//
// Layer: frame over rows. Each is the frame of an updating call, implicit completion included, around its worker in
// rg_i_set_values. A negative index is taken as a large one, and so is out of range.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_set_field 1.0";

} // namespace

kt_int32_t rg_set_field_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t column_name,
                                   kt_value_t * new_field)
{
    return rg_i_updating_call<entry_id::set_field_by_index>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_value_for_packed_index(&table, static_cast<kt_uint32_t>(row_index), column_name, new_field);
    });
}

kt_int32_t rg_set_field_by_fixed_index_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                         kt_char_ptr_t column_name, kt_value_t * new_field)
{
    return rg_i_updating_call<entry_id::set_field_by_fixed_index>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_value_for_fixed_index(&table, static_cast<kt_uint32_t>(fixed_row_index), column_name,
                                              new_field);
    });
}

kt_int32_t rg_set_field_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t column_name,
                                 kt_value_t * result)
{
    return rg_i_updating_call<entry_id::set_field_by_key>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_value_for_key(&table, row_key, column_name, result);
    });
}
