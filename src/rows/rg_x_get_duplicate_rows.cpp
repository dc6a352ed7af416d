// SPDX-License-Identifier: MIT
// rg_x_get_duplicate_rows: the exported call that lists the rows with a given key.
//
// Layer: frame over rows. The frame of a reading call around the worker in rg_i_row_lists.
#include "frame/rg_i_call_frame.h"
#include "rows/rg_i_row_lists.h"

namespace
{

constexpr char module_version[] = "rg_x_get_duplicate_rows 1.0";

} // namespace

kt_int32_t rg_get_duplicate_rows_1(rg_opaque_handle_t table_handle, kt_value_t key_value,
                                   kt_uint32_t *  p_duplicate_rows_count,
                                   kt_uint32_t ** p_p_duplicate_rows_fixed_indices,
                                   kt_uint32_t    uncommitted_updates_visible)
{
    return rg_i_reading_call<entry_id::get_duplicate_rows>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_get_duplicate_rows(&table, key_value, p_duplicate_rows_count, p_p_duplicate_rows_fixed_indices,
                                       uncommitted_updates_visible);
    });
}
