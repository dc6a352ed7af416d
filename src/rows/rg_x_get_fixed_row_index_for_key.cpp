// SPDX-License-Identifier: MIT
// rg_x_get_fixed_row_index_for_key: the exported call that finds a row's permanent position by its key.
//
// Layer: frame over rows. The frame of a reading call around the lookup in rg_i_get_values.
#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_get_fixed_row_index_for_key 1.0";

} // namespace

kt_int32_t rg_get_fixed_row_index_for_key_1(rg_opaque_handle_t table_handle, kt_value_t key_value,
                                            kt_uint32_t * p_fixed_row_index)
{
    return rg_i_reading_call<entry_id::get_fixed_row_index_for_key>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_get_fixed_row_index_for_key(&table, key_value, p_fixed_row_index);
    });
}
