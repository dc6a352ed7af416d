// SPDX-License-Identifier: MIT
// packed: a table packed into a buffer, the buffer turned, and unpacked into another tree, which is then closed.
#include <cstdlib>
#include <cstring>
#include <memory>

#include "common/require.h"
#include "foreign.h"
#include "groups.h"

namespace growth
{

namespace
{

using buffer = std::unique_ptr<char, decltype(&std::free)>;

std::size_t length_of(const buffer & b)
{
    kt_uint32_t length;
    std::memcpy(&length, b.get(), sizeof length);
    return length;
}

buffer packed(rg_opaque_handle_t table)
{
    kt_uint32_t zero     = 0;
    void *      p_buffer = nullptr;
    check(rg_pack_tables_1(1, &table, &zero, &zero, nullptr, &p_buffer), "pack");
    return {static_cast<char *>(p_buffer), &std::free};
}

void look_into(run & r, table_in_memory & t, const buffer & b)
{
    r.measure_call("get_total_packed_tables", t.how(), [&] {
        kt_uint32_t total;
        check(rg_get_total_packed_tables_1(b.get(), &total), "look");
    });
    r.measure_call("get_packed_table_name", t.how(), [&] {
        kt_char_ptr_t p_name;
        check(rg_get_packed_table_name_1(b.get(), 0, &p_name), "look");
    });
    r.measure_call("convert, own order", t.how(),
                   [&] { check(rg_convert_packed_table_buffer_1(b.get(), 0, 0), "convert"); });
}

void convert(run & r, table_in_memory & t, const buffer & b)
{
    if (!r.wants("convert, other order"))
        return;
    r.repeat_long([&] {
        buffer foreign(static_cast<char *>(std::malloc(length_of(b))), &std::free);
        std::memcpy(foreign.get(), b.get(), length_of(b));
        turn_to_foreign_order(foreign.get());
        r.time("convert, other order", t.how(), r.rows(),
               [&] { check(rg_convert_packed_table_buffer_1(foreign.get(), 0, 0), "convert"); });
        require(length_of(foreign) == length_of(b), "a buffer was converted wrongly");
    });
}

void unpack(run & r, table_in_memory & t, const buffer & b)
{
    if (!r.wants("unpack_table") && !r.wants("close_tree"))
        return;
    const hashing h = hashing_for(false, r.rows());
    r.repeat_long([&] {
        rg_opaque_handle_t tree;
        rg_opaque_handle_t table;
        check(rg_open_tree_1(&tree, 0, 0), "open tree");
        r.time("unpack_table", t.how(), r.rows(),
               [&] { check(rg_unpack_table_1(b.get(), h.buckets, h.p_hash, h.p_compare, tree, 0, &table), "unpack"); });
        require(rows_of(table) == r.rows(), "rows were lost on the way");
        r.time("close_tree", t.how(), r.rows(), [&] { check(rg_close_tree_1(tree), "close tree"); });
    });
}

} // namespace

void measure_packed(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::rows, family::calls}))
        return;
    r.measure_rows("pack_tables", t.how(), [&] { packed(t.handle()); });
    const buffer b = packed(t.handle());
    look_into(r, t, b);
    convert(r, t, b);
    unpack(r, t, b);
}

} // namespace growth
