// SPDX-License-Identifier: MIT
// changes: rows set, added and deleted in memory under explicit control, in batches that are aborted or committed, and
// in transactions of one row.
#include <algorithm>
#include <cstdlib>
#include <numeric>
#include <random>

#include "groups.h"

namespace growth
{

namespace
{

// A batch of a small table isn't most of it.
std::size_t batch_of(const run & r)
{
    return std::min(r.chosen().batch, r.rows() / 4);
}

// What is set: a count, or a count and a note, which may have any length.
struct new_values {
    new_values()                               = default;
    new_values(const new_values &)             = delete;
    new_values & operator=(const new_values &) = delete;
    kt_value_t   count{.val_int64 = 0};
    kt_value_t   note{};
    kt_value_t * pointers[2]{&count, &note};
    // Never what stands in the row.
    void change()
    {
        count.val_int64 += 1'001;
        note.ptr_char = any_note(static_cast<std::uint64_t>(count.val_int64));
    }
};

kt_char_ptr_t Names[]{Count, Note};

// Calls set() for the rows of a batch, and aborts them.
template <class Set> void set_and_abort(run & r, table_in_memory & t, std::string_view curve, Set set)
{
    if (!r.wants(curve) && !r.wants("abort") && !r.wants("get_updated_rows"))
        return;
    const std::size_t batch = batch_of(r);
    for (int i = 0; i < r.chosen().repeat; ++i) {
        r.time(curve, t.how(), batch, [&] {
            for (std::size_t n = 0; n < batch; ++n)
                check(set(), "set");
        });
        kt_uint32_t   total;
        kt_uint32_t * p_rows = nullptr;
        r.time("get_updated_rows", t.how(), batch,
               [&] { check(rg_get_updated_rows_1(t.handle(), &total, &p_rows), "list"); });
        std::free(p_rows);
        r.time("abort", t.how(), batch, [&] { check(rg_abort_1(t.handle()), "abort"); });
    }
}

row_values & values_of(std::uint64_t id, row_values & values, row & r)
{
    r = row_of(id);
    values.become(r);
    return values;
}

void add_and_abort(run & r, table_in_memory & t, std::string_view curve)
{
    const std::size_t batch = batch_of(r);
    if (!r.wants(curve))
        return;
    std::vector<row> rows(batch);
    for (int i = 0; i < r.chosen().repeat; ++i) {
        for (row & one : rows)
            one = row_of(t.new_id());
        row_values values;
        r.time(curve, t.how(), batch, [&] {
            for (const row & one : rows) {
                values.become(one);
                check(rg_add_row_1(t.handle(), values.names, values.pointers, columns), "add");
            }
        });
        check(rg_abort_1(t.handle()), "abort");
    }
}

void delete_and_abort(run & r, table_in_memory & t)
{
    const std::size_t batch   = batch_of(r);
    auto              indices = t.packed_indices();
    for (int i = 0; i < r.chosen().repeat; ++i) {
        r.time("delete_row_by_index", t.how(), batch, [&] {
            for (std::size_t n = 0; n < batch; ++n)
                check(rg_delete_row_by_index_1(t.handle(), indices.next()), "delete");
        });
        check(rg_abort_1(t.handle()), "abort");
    }
}

// Times what finishes a batch.
void apply_then_commit(run & r, table_in_memory & t, std::size_t batch, std::string_view commit)
{
    r.time("apply", t.how(), batch, [&] { check(rg_apply_1(t.handle(), 0), "apply"); });
    r.time(commit, t.how(), batch, [&] { check(rg_commit_1(t.handle()), "commit"); });
}

void commit_batches(run & r, table_in_memory & t)
{
    const std::size_t batch = batch_of(r);
    std::mt19937_64   random(r.rows());
    new_values        to;
    row_values        values;
    row               one;
    for (int i = 0; i < r.chosen().repeat; ++i) {
        scattered order(r.rows());
        for (std::size_t n = 0; n < batch; ++n) {
            to.change();
            check(rg_set_fields_by_index_1(t.handle(), static_cast<kt_int32_t>(random() % r.rows()), Names, to.pointers,
                                           2),
                  "set");
        }
        apply_then_commit(r, t, batch, "commit");
        for (std::size_t n = 0; n < batch; ++n) {
            values_of(t.new_id(), values, one);
            check(rg_add_row_1(t.handle(), values.names, values.pointers, columns), "add");
        }
        apply_then_commit(r, t, batch, "commit of adds");
        const std::size_t start = random();
        for (std::size_t n = 0; n < batch; ++n)
            check(rg_delete_row_by_index_1(t.handle(), static_cast<kt_uint32_t>((order.next() + start) % r.rows())),
                  "delete");
        apply_then_commit(r, t, batch, "commit of deletes");
    }
}

void commit_single_rows(run & r, table_in_memory & t)
{
    std::mt19937_64 random(r.rows() + 1);
    const auto      any_index = [&] { return static_cast<kt_uint32_t>(random() % r.rows()); };
    new_values      to;
    {
        auto keys = t.keys();
        r.measure_call("set, apply, commit", t.how(), [&] {
            to.change();
            check(rg_set_field_by_key_1(t.handle(), value_of(keys.next()), Count, &to.count), "set");
            apply_and_commit(t.handle());
        });
    }
    // Rows come and go in turns, so that the table keeps its size; each is timed by itself over a batch.
    const std::size_t batch = batch_of(r);
    std::vector<row>  rows(batch);
    row_values        values;
    for (int i = 0; i < r.chosen().repeat; ++i) {
        for (row & one : rows)
            one = row_of(t.new_id());
        r.time("add, apply, commit", t.how(), batch, [&] {
            for (const row & one : rows) {
                values.become(one);
                check(rg_add_row_1(t.handle(), values.names, values.pointers, columns), "add");
                apply_and_commit(t.handle());
            }
        });
        r.time("delete, apply, commit", t.how(), batch, [&] {
            for (std::size_t n = 0; n < batch; ++n) {
                check(rg_delete_row_by_index_1(t.handle(), any_index()), "delete");
                apply_and_commit(t.handle());
            }
        });
    }
}

} // namespace

void measure_settings(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::changes}))
        return;
    rg_opaque_handle_t h      = t.handle();
    auto               keys   = t.keys();
    auto               packed = t.packed_indices();
    auto               fixed  = t.fixed_indices();
    const auto         p      = [&] { return static_cast<kt_int32_t>(packed.next()); };
    const auto         f      = [&] { return static_cast<kt_int32_t>(fixed.next()); };
    new_values         to;
    set_and_abort(r, t, "set_field_by_key", [&] {
        to.change();
        return rg_set_field_by_key_1(h, value_of(keys.next()), Count, &to.count);
    });
    set_and_abort(r, t, "set_fields_by_key", [&] {
        to.change();
        return rg_set_fields_by_key_1(h, value_of(keys.next()), Names, to.pointers, 2);
    });
    set_and_abort(r, t, "set_field_by_index", [&] {
        to.change();
        return rg_set_field_by_index_1(h, p(), Count, &to.count);
    });
    set_and_abort(r, t, "set_fields_by_index", [&] {
        to.change();
        return rg_set_fields_by_index_1(h, p(), Names, to.pointers, 2);
    });
    set_and_abort(r, t, "set_field_by_fixed_index", [&] {
        to.change();
        return rg_set_field_by_fixed_index_1(h, f(), Count, &to.count);
    });
    set_and_abort(r, t, "set_fields_by_fixed_index", [&] {
        to.change();
        return rg_set_fields_by_fixed_index_1(h, f(), Names, to.pointers, 2);
    });
    add_and_abort(r, t, "add_row");
    delete_and_abort(r, t);
}

void measure_transactions(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::changes}))
        return;
    commit_single_rows(r, t);
    commit_batches(r, t);
}

void measure_without_hash(run & r, table_in_memory & t)
{
    if (r.wants("get_field_by_key, no hash")) {
        auto       keys = t.keys();
        kt_value_t value;
        // A lookup walks until the walks have cost as much as the index that ends them.
        for (int i = 0; i < 100; ++i)
            check(rg_get_field_by_key_1(t.handle(), value_of(keys.next()), Count, &value), "get");
        r.measure_call("get_field_by_key, no hash", t.how(),
                       [&] { check(rg_get_field_by_key_1(t.handle(), value_of(keys.next()), Count, &value), "get"); });
    }
    add_and_abort(r, t, "add_row, no hash");
    r.measure_rows("get_duplicate_rows, no hash", t.how(), [&] {
        kt_uint32_t   total;
        kt_uint32_t * p_rows = nullptr;
        check(rg_get_duplicate_rows_1(t.handle(), value_of(r.rows() / 2), &total, &p_rows, 0), "list");
        std::free(p_rows);
    });
}

} // namespace growth
