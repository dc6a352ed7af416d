// SPDX-License-Identifier: MIT
// rg_x_get_updated_rows: the exported call that lists the rows with pending changes.
//
// Layer: frame over rows. The frame of a reading call around the worker in rg_i_row_lists.
#include "frame/rg_i_call_frame.h"
#include "rows/rg_i_row_lists.h"

namespace
{

constexpr char module_version[] = "rg_x_get_updated_rows 1.0";

} // namespace

kt_int32_t rg_get_updated_rows_1(rg_opaque_handle_t table_handle, kt_uint32_t * p_updated_rows_count,
                                 kt_uint32_t ** p_p_updated_rows_fixed_indices)
{
    return rg_i_reading_call<entry_id::get_updated_rows>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_get_updated_rows(&table, p_updated_rows_count, p_p_updated_rows_fixed_indices);
    });
}
