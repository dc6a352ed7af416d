// SPDX-License-Identifier: MIT
// rg_x_get_selected_rows: the exported call that lists the rows that match criteria.
//
// Layer: frame over rows. The frame of a reading call around the worker in rg_i_row_lists.
#include <cstdarg>

#include "frame/rg_i_call_frame.h"
#include "rows/rg_i_criteria.h"
#include "rows/rg_i_row_lists.h"

namespace
{

constexpr char module_version[] = "rg_x_get_selected_rows 1.0";

[[nodiscard]] kt_int32_t list_matching_rows(rg_i_table_t & table, kt_char_ptr_t p_selection_criteria, va_list ap,
                                            kt_uint32_t uncommitted_updates_visible, kt_uint32_t * p_total,
                                            kt_uint32_t ** p_p_rows)
{
    owned_buffer text;
    if (p_selection_criteria != nullptr)
        if (const kt_int32_t rc = rg_i_select_printf(text.out(), p_selection_criteria, ap); rc != 0)
            return rc;
    return rg_i_get_selected_rows(&table, text.get(), uncommitted_updates_visible, p_total, p_p_rows);
}

} // namespace

kt_int32_t rg_get_selected_rows_v_1(rg_opaque_handle_t table_handle, kt_char_ptr_t p_selection_criteria, va_list ap,
                                    kt_uint32_t uncommitted_updates_visible, kt_uint32_t * p_total_selected_rows,
                                    kt_uint32_t ** p_p_selected_rows_fixed_index)
{
    return rg_i_reading_call<entry_id::get_selected_rows_v>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return list_matching_rows(table, p_selection_criteria, ap, uncommitted_updates_visible, p_total_selected_rows,
                                  p_p_selected_rows_fixed_index);
    });
}
