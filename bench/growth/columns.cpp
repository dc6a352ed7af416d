// SPDX-License-Identifier: MIT
// columns: the four changes of columns, each on a copy in memory of its own: the second one of a table would be refused.
#include "groups.h"

namespace growth
{

namespace
{

constexpr const char * Copy = "/changed";

template <class Change> void change_a_copy(run & r, table_in_memory & t, std::string_view curve, Change change)
{
    if (!r.wants(curve))
        return;
    r.repeat_long([&] {
        check(rg_copy_table_by_handle_1(t.handle(), path(Copy), 0), "copy");
        rg_opaque_handle_t table;
        check(rg_open_table_1(t.tree(), path(Copy), explicit_control, &table), "open");
        r.time(curve, t.how(), r.rows(), [&] { check(change(table), "change columns"); });
        check(rg_close_table_1(table), "close");
        check(rg_delete_table_1(t.tree(), path(Copy)), "delete");
    });
}

} // namespace

void measure_columns(run & r, table_in_memory & t)
{
    change_a_copy(r, t, "add_columns", [](rg_opaque_handle_t table) {
        rg_column_t added = column(Added, KT_INT64, false);
        return rg_add_columns_1(table, &added, 1);
    });
    change_a_copy(r, t, "delete_columns", [](rg_opaque_handle_t table) {
        kt_char_ptr_t names[]{Note};
        return rg_delete_columns_1(table, names, 1);
    });
    change_a_copy(r, t, "change_column_name",
                  [](rg_opaque_handle_t table) { return rg_change_column_name_1(table, Count, Added); });
    change_a_copy(r, t, "change_default_value",
                  [](rg_opaque_handle_t table) { return rg_change_default_value_1(table, Count, value_of(7)); });
}

} // namespace growth
