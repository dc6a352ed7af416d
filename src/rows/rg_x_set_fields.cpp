// SPDX-License-Identifier: MIT
// rg_x_set_fields: the exported calls that set several fields of a row.
//
// Layer: frame over rows. Each is the frame of an updating call, implicit completion included, around its worker in
// rg_i_set_values. A negative index is taken as a large one, and so is out of range.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_set_fields 1.0";

} // namespace

kt_int32_t rg_set_fields_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t * column_names,
                                    kt_value_t ** new_fields, kt_uint32_t array_count)
{
    return rg_i_updating_call<entry_id::set_fields_by_index>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_values_for_packed_index(&table, static_cast<kt_uint32_t>(row_index), column_names, new_fields,
                                                array_count);
    });
}

kt_int32_t rg_set_fields_by_fixed_index_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                          kt_char_ptr_t * column_names, kt_value_t ** new_fields,
                                          kt_uint32_t array_count)
{
    return rg_i_updating_call<entry_id::set_fields_by_fixed_index>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_values_for_fixed_index(&table, static_cast<kt_uint32_t>(fixed_row_index), column_names,
                                               new_fields, array_count);
    });
}

kt_int32_t rg_set_fields_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t * column_names,
                                  kt_value_t ** new_values, kt_uint32_t array_count)
{
    return rg_i_updating_call<entry_id::set_fields_by_key>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_values_for_key(&table, row_key, column_names, new_values, array_count);
    });
}
