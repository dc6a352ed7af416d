// SPDX-License-Identifier: MIT
// calls: what concerns no row, called beside a table of that size.
#include <cstdlib>
#include <cstring>
#include <memory>

#include "groups.h"

namespace growth
{

namespace
{

void trees(run & r, table_in_memory & t)
{
    r.measure_call("open_tree, close_tree", t.how(), [] {
        rg_opaque_handle_t tree;
        check(rg_open_tree_1(&tree, 0, 0), "open tree");
        check(rg_close_tree_1(tree), "close tree");
    });
    r.measure_call("mount, unmount", t.how(), [&] {
        check(rg_mount_local_tree_1(t.tree(), path("/m"), path(r.chosen().directory.c_str()), 1), "mount");
        check(rg_unmount_local_tree_1(t.tree(), path("/m")), "unmount");
    });
    r.measure_call("list_tables", t.how(), [&] {
        kt_char_ptr_t * p_list = nullptr;
        kt_uint32_t     total;
        check(rg_list_tables_1(t.tree(), path("/"), &p_list, &total), "list tables");
        check(rg_free_table_list_1(p_list, total), "free list");
    });
    r.measure_call("directory list", t.how(), [&] {
        rg_entry_metadata_t * p_list = nullptr;
        kt_uint32_t           total;
        check(rg_i_get_directory_list_compat(t.tree(), path("/"), &p_list, &total), "list tables");
        check(rg_i_free_directory_list_compat(p_list, total), "free list");
        check(rg_i_create_directory_compat(), "create directory");
        check(rg_i_delete_directory_compat(), "delete directory");
    });
}

void tables(run & r, table_in_memory & t)
{
    r.measure_call("create_table, close, delete", t.how(), [&] {
        check(rg_close_table_1(create(t.tree(), "/new", 0, false)), "close");
        check(rg_delete_table_1(t.tree(), path("/new")), "delete");
    });
    const auto open = [&](auto how) {
        rg_opaque_handle_t table;
        check(how(&table), "open");
        check(rg_close_table_1(table), "close");
    };
    r.measure_call("open_table, close_table", t.how(), [&] {
        open([&](auto * p_table) { return rg_open_table_1(t.tree(), path(t.name), RG_MODE_READ, p_table); });
    });
    const hashing h = hashing_for(false, r.rows());
    r.measure_call("open_hashed_key_table, close_table", t.how(), [&] {
        open([&](auto * p_table) {
            return rg_open_hashed_key_table_1(t.tree(), path(t.name), RG_MODE_READ, h.buckets, h.p_hash, h.p_compare,
                                              p_table);
        });
    });
    const char * p_from = table_in_memory::name;
    const char * p_to   = "/moved";
    r.measure_call("move_table_by_handle", t.how(), [&] {
        check(rg_move_table_by_handle_1(t.handle(), path(p_to), 0), "move");
        std::swap(p_from, p_to);
    });
    r.measure_call("move_table_by_name", t.how(), [&] {
        check(rg_move_table_by_name_1(t.tree(), path(p_from), path(p_to), 0), "move");
        std::swap(p_from, p_to);
    });
    if (p_to == table_in_memory::name)
        check(rg_move_table_by_name_1(t.tree(), path(p_from), path(p_to), 0), "move back");
}

void descriptions(run & r, table_in_memory & t)
{
    r.measure_call("get_table_metadata", t.how(), [&] {
        rg_table_metadata_t * p_metadata = nullptr;
        check(rg_get_table_metadata_1(t.handle(), -1, &p_metadata), "describe");
        check(rg_free_table_metadata_1(p_metadata), "free description");
    });
    r.measure_call("overlay_default_value", t.how(),
                   [&] { check(rg_overlay_memory_default_value_1(t.handle(), Count, value_of(0)), "overlay"); });
    r.measure_call("overlay_column_qualifier", t.how(),
                   [&] { check(rg_overlay_memory_column_qualifier_1(t.handle(), Count, RG_STANDARD), "overlay"); });
}

void application_metadata(run & r, table_in_memory & t)
{
    constexpr kt_uint32_t length = 100;
    const auto            p_room = std::make_unique<char[]>(sizeof(kt_binary_t) + length);
    auto * const          p_data = reinterpret_cast<kt_binary_t *>(p_room.get());
    p_data->length               = length;
    check(rg_set_application_metadata_1(t.handle(), p_data), "set metadata");
    apply_and_commit(t.handle());
    r.measure_call("get_application_metadata", t.how(), [&] {
        kt_binary_t * p_copy = nullptr;
        check(rg_get_application_metadata_1(t.handle(), &p_copy), "get metadata");
        std::free(p_copy);
    });
    r.measure_call("set_application_metadata", t.how(), [&] {
        check(rg_set_application_metadata_1(t.handle(), p_data), "set metadata");
        check(rg_abort_1(t.handle()), "abort");
    });
}

} // namespace

void measure_calls(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::calls}))
        return;
    trees(r, t);
    tables(r, t);
    descriptions(r, t);
    application_metadata(r, t);
}

} // namespace growth
