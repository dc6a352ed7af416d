// SPDX-License-Identifier: MIT
// rg_x_select: the exported call that makes a table of selected rows.
//
// Layer: frame over rows. A frame of its own: a reading call that takes the tree's write lock ahead of the table's read
// lock, because the result enters the tree's search tree of unnamed tables. Neither a fork nor ForkMutex is looked at.
#include <cstdarg>

#include "frame/rg_i_call_frame.h"
#include "rows/rg_i_criteria.h"
#include "rows/rg_i_row_lists.h"

namespace
{

constexpr char module_version[] = "rg_x_select 1.0";

struct request_t {
    kt_char_ptr_t *      p_column_names;
    kt_uint32_t          total_column_names;
    rg_opaque_handle_t * p_result;
    kt_char_ptr_t        p_selection;
};

// Both locks are held.
[[nodiscard]] kt_int32_t select_rows(rg_i_table_t & table, const request_t & request, va_list ap)
{
    owned_buffer text;
    if (request.p_selection != nullptr)
        if (const kt_int32_t rc = rg_i_select_printf(text.out(), request.p_selection, ap); rc != 0)
            return rc;
    rg_i_table_t * p_result = nullptr;
    if (const kt_int32_t rc =
            rg_i_select(&table, request.p_column_names, request.total_column_names, text.get(), &p_result);
        rc != 0)
        return rc;
    if (tsearch(p_result, &table.p_tree->p_unnamed_tables, rg_i_pointer_compare) == nullptr) {
        rg_i_close_table(p_result);
        return rg_i_fail_no_memory(RG_HERE);
    }
    *request.p_result = p_result;
    return 0;
}

[[nodiscard]] kt_int32_t select_under_locks(rg_opaque_handle_t table_handle, const request_t & request, va_list ap)
{
    if (table_handle == nullptr)
        return rg_i_fail(RG_HERE, RG_E_INVALID_HANDLE);
    if (request.p_result == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_table_t & table = *static_cast<rg_i_table_t *>(table_handle);
    write_guard    tree_lock(table.p_tree->lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    read_guard table_lock(table.lock);
    if (table_lock.code() != 0)
        return table_lock.code();
    return select_rows(table, request, ap);
}

} // namespace

kt_int32_t rg_select_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * column_names, kt_uint32_t array_count,
                       rg_opaque_handle_t * result, kt_char_ptr_t selection_string, ...)
{
    rg_i_trace_entry(entry_id::select);
    va_list ap;
    va_start(ap, selection_string);
    const kt_int32_t rc = select_under_locks(table_handle, {column_names, array_count, result, selection_string}, ap);
    va_end(ap);
    return rg_i_finish_call(entry_id::select, rc);
}
