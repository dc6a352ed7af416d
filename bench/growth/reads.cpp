// SPDX-License-Identifier: MIT
// reads: one row, found by key, by packed index or by fixed index: one field, an integer, or all five fields, whose
// strings are copied out and freed.
#include <cstdlib>

#include "groups.h"

namespace growth
{

namespace
{

struct five_fields : row_values {
    void free_strings() const
    {
        std::free(values[3].ptr_char);
        std::free(values[4].ptr_char);
    }
};

void by_key(run & r, table_in_memory & t)
{
    rg_opaque_handle_t h    = t.handle();
    auto               keys = t.keys();
    kt_value_t         value;
    five_fields        row;
    r.measure_call("get_field_by_key", t.how(),
                   [&] { check(rg_get_field_by_key_1(h, value_of(keys.next()), Count, &value), "get"); });
    r.measure_call("get_field_by_key_visibility", t.how(), [&] {
        check(rg_get_field_by_key_and_visibility_1(h, value_of(keys.next()), Count, &value, 1, nullptr), "get");
    });
    r.measure_call("get_fields_by_key", t.how(), [&] {
        check(rg_get_fields_by_key_1(h, value_of(keys.next()), row.names, row.pointers, columns), "get");
        row.free_strings();
    });
    r.measure_call("get_fields_by_key_visibility", t.how(), [&] {
        check(rg_get_fields_by_key_and_visibility_1(h, value_of(keys.next()), row.names, row.pointers, columns, 1,
                                                    nullptr),
              "get");
        row.free_strings();
    });
    r.measure_call("get_fixed_row_index_for_key", t.how(), [&] {
        kt_uint32_t fixed;
        check(rg_get_fixed_row_index_for_key_1(h, value_of(keys.next()), &fixed), "get");
    });
    r.measure_call("get_duplicate_rows", t.how(), [&] {
        kt_uint32_t   total;
        kt_uint32_t * p_rows = nullptr;
        check(rg_get_duplicate_rows_1(h, value_of(keys.next()), &total, &p_rows, 0), "list");
        std::free(p_rows);
    });
}

void by_index(run & r, table_in_memory & t)
{
    rg_opaque_handle_t h       = t.handle();
    auto               indices = t.packed_indices();
    const auto         next    = [&] { return static_cast<kt_int32_t>(indices.next()); };
    kt_value_t         value;
    five_fields        row;
    r.measure_call("get_field_by_index", t.how(),
                   [&] { check(rg_get_field_by_index_1(h, next(), Count, &value), "get"); });
    r.measure_call("get_field_by_index_visibility", t.how(),
                   [&] { check(rg_get_field_by_index_and_visibility_1(h, next(), Count, &value, 1, nullptr), "get"); });
    r.measure_call("get_fields_by_index", t.how(), [&] {
        check(rg_get_fields_by_index_1(h, next(), row.names, row.pointers, columns), "get");
        row.free_strings();
    });
    r.measure_call("get_fields_by_index_visibility", t.how(), [&] {
        check(rg_get_fields_by_index_and_visibility_1(h, next(), row.names, row.pointers, columns, 1, nullptr), "get");
        row.free_strings();
    });
}

void by_fixed_index(run & r, table_in_memory & t)
{
    rg_opaque_handle_t h       = t.handle();
    auto               indices = t.fixed_indices();
    const auto         next    = [&] { return static_cast<kt_int32_t>(indices.next()); };
    kt_value_t         value;
    five_fields        row;
    r.measure_call("get_field_by_fixed_index", t.how(), [&] {
        check(rg_get_field_by_fixed_index_and_visibility_1(h, next(), Count, &value, 0, nullptr), "get");
    });
    r.measure_call("get_fields_by_fixed_index", t.how(), [&] {
        check(rg_get_fields_by_fixed_index_and_visibility_1(h, next(), row.names, row.pointers, columns, 0, nullptr),
              "get");
        row.free_strings();
    });
}

} // namespace

void measure_reads(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::reads}))
        return;
    by_key(r, t);
    by_index(r, t);
    by_fixed_index(r, t);
}

} // namespace growth
