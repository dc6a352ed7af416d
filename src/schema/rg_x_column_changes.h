// SPDX-License-Identifier: MIT
// rg_x_column_changes: the frame of the exported calls that change columns. Builders test the table's mode themselves
// and overlays don't, and each change is complete when its worker returns.
#pragma once

#include "frame/rg_i_call_frame.h"
#include "schema/rg_i_column_changes.h"

template <entry_id id, class Worker>
[[nodiscard]] kt_int32_t rg_i_column_call(const rg_i_site_t & site, rg_opaque_handle_t table_handle, Worker && worker)
{
    return rg_i_updating_frame<id, needs_write_mode::no, completes_implicitly::no>(site, table_handle, worker);
}

// The same around a builder, which gets the table and where to put the new one.
template <entry_id id, class Builder>
[[nodiscard]] kt_int32_t rg_i_column_change_call(const rg_i_site_t & site, rg_opaque_handle_t table_handle,
                                                 Builder && build)
{
    return rg_i_column_call<id>(site, table_handle, [&](rg_i_table_t & table) -> kt_int32_t {
        rg_i_table_t * p_new_table = nullptr;
        if (const kt_int32_t rc = build(table, &p_new_table); rc != 0)
            return rc;
        return rg_i_take_new_columns(&table, p_new_table);
    });
}
