// SPDX-License-Identifier: MIT
// rg_x_delete_rows: the exported calls that delete rows.
//
// Layer: frame over rows. The frame of an updating call, implicit completion included, around the workers in
// rg_i_delete_rows.
#include <cstdarg>

#include "frame/rg_i_call_frame.h"
#include "rows/rg_i_criteria.h"

namespace
{

constexpr char module_version[] = "rg_x_delete_rows 1.0";

// Kept because callers depend on it: unlike every other update this one has no test for applied updates, and goes
// through between apply and commit.
[[nodiscard]] kt_int32_t delete_row_at(rg_i_table_t & table, kt_uint32_t row_index)
{
    if (row_index >= table.total_applied_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    return rg_i_delete_row(&table, &table.p_rows_fixed_index[table.p_rows_packed_index[row_index]]);
}

[[nodiscard]] kt_int32_t delete_matching_rows(rg_i_table_t & table, kt_char_ptr_t p_selection_criteria, va_list ap)
{
    owned_buffer text;
    if (p_selection_criteria != nullptr)
        if (const kt_int32_t rc = rg_i_select_printf(text.out(), p_selection_criteria, ap); rc != 0)
            return rc;
    return rg_i_delete_rows(&table, text.get());
}

} // namespace

kt_int32_t rg_delete_row_by_index_1(rg_opaque_handle_t table_handle, kt_uint32_t row_index)
{
    return rg_i_updating_call<entry_id::delete_row_by_index>(
        RG_HERE, table_handle, [&](rg_i_table_t & table) { return delete_row_at(table, row_index); });
}

kt_int32_t rg_delete_rows_1(rg_opaque_handle_t table_handle, kt_char_ptr_t selection_criteria, ...)
{
    va_list ap;
    va_start(ap, selection_criteria);
    const kt_int32_t rc = rg_i_updating_call<entry_id::delete_rows>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return delete_matching_rows(table, selection_criteria, ap);
    });
    va_end(ap);
    return rc;
}
