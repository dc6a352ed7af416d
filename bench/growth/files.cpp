// SPDX-License-Identifier: MIT
// files: a table with a file, fresh and with ten versions of each row in it: transactions, opening, copying, moving,
// column changes, and transactions once it has been opened anew.
#include <cstdlib>
#include <filesystem>

#include "common/machine.h"
#include "common/require.h"
#include "groups.h"

namespace growth
{

namespace
{

constexpr const char * Rows   = "/m/rows";
constexpr const char * Copy   = "/m/copy";
constexpr const char * Moved  = "/m/moved";
constexpr const char * Memory = "/memory";

constexpr int versions = 10;

class files
{
  public:
    explicit files(run & r)
        : run_(r), directory_(r.chosen().directory + "/tables"), disk_(r.chosen().directory + "/machine")
    {
        std::filesystem::create_directories(directory_);
        check(rg_open_tree_1(&tree_, 0, 0), "open tree");
        check(rg_mount_local_tree_1(tree_, path("/m"), directory_.data(), 1), "mount");
    }
    ~files()
    {
        rg_close_tree_1(tree_);
        std::error_code ignored;
        std::filesystem::remove_all(directory_, ignored);
    }
    files(const files &)             = delete;
    files & operator=(const files &) = delete;

    void measure_calls()
    {
        for (int i = 0; i < run_.chosen().transactions; ++i)
            run_.time_synced("create_table, file", state::fresh, disk_, [&] {
                check(rg_close_table_1(create(tree_, "/m/new", 0, false)), "close");
                check(rg_delete_table_1(tree_, path("/m/new")), "delete");
            });
        kt_char_ptr_t names[]{path(Rows)};
        run_.measure_call("repair_tables", state::fresh, [&] { check(rg_repair_tables_1(tree_, names, 1), "repair"); });
    }

    // From the creation of the file to its end.
    void measure_life(state s)
    {
        make(s);
        transactions(s);
        check(rg_close_table_1(table_), "close");
        opening(s);
        copying(s);
        moving(s);
        if (s == state::versions)
            first_transaction(s);
        reopen();
        if (s == state::fresh)
            transactions(state::reopened);
        column_changes(s);
        check(rg_close_table_1(table_), "close");
        deleting(s);
    }

  private:
    void make(state s)
    {
        table_   = create(tree_, Rows, run_.rows(), true);
        next_id_ = run_.rows();
        load(table_, 0, run_.rows(), false);
        for (int version = 1; s == state::versions && version < versions; ++version) {
            kt_value_t count;
            scattered  order(run_.rows());
            for (std::size_t i = 0; i < run_.rows(); ++i) {
                const std::size_t id = order.next();
                count.val_int64 = static_cast<std::int64_t>((id * 7919 + static_cast<std::size_t>(version)) % 1000);
                check(rg_set_field_by_key_1(table_, value_of(id), Count, &count), "set");
            }
            apply_and_commit(table_);
        }
    }

    rg_opaque_handle_t open(const char * p_path, kt_int32_t mode, bool hashed)
    {
        rg_opaque_handle_t table;
        const hashing      h = hashing_for(false, run_.rows());
        check(hashed ? rg_open_hashed_key_table_1(tree_, path(p_path), mode, h.buckets, h.p_hash, h.p_compare, &table)
                     : rg_open_table_1(tree_, path(p_path), mode, &table),
              "open");
        return table;
    }
    void reopen() { table_ = open(Rows, explicit_control, true); }

    // ---- Transactions of one row ----

    void set_one()
    {
        kt_value_t count;
        count.val_int64 = static_cast<std::int64_t>(next_id_++);
        check(rg_set_field_by_key_1(table_, value_of(count.val_uint64 * 7919 % run_.rows()), Count, &count), "set");
        apply_and_commit(table_);
    }
    // The rows that are set later stay: what is added is deleted again.
    void add_one()
    {
        const row  r = row_of(next_id_++);
        row_values values;
        values.become(r);
        check(rg_add_row_1(table_, values.names, values.pointers, columns), "add");
        apply_and_commit(table_);
    }
    void delete_one()
    {
        check(rg_delete_row_by_index_1(table_, static_cast<kt_uint32_t>(run_.rows())), "delete");
        apply_and_commit(table_);
    }

    void transactions(state s)
    {
        if (!run_.wants_any_of({family::transactions}))
            return;
        const double start = seconds_now(clock_kind::wall);
        for (int i = 0; i < 3 * run_.chosen().transactions; ++i) {
            run_.time_synced("durable set", s, disk_, [&] { set_one(); });
            run_.time_synced("durable add", s, disk_, [&] { add_one(); });
            run_.time_synced("durable delete", s, disk_, [&] { delete_one(); });
            if (seconds_now(clock_kind::wall) - start > run_.chosen().share)
                break;
        }
    }

    void first_transaction(state s)
    {
        reopen();
        run_.time("first after opening 10 versions", s, run_.rows(), [&] { set_one(); });
        check(rg_close_table_1(table_), "close");
    }

    // ---- The whole file ----

    void opening(state s)
    {
        rg_opaque_handle_t table;
        const auto         close = [&] { check(rg_close_table_1(table), "close"); };
        table = open(Rows, RG_MODE_READ, false); // so that the first one isn't dearer than the others
        close();
        run_.measure_rows(
            "open_table, file", s, [&] { table = open(Rows, RG_MODE_READ, false); }, close);
        if (run_.wants("open_hashed_key_table, file") || run_.wants("close_table, file"))
            run_.repeat_long([&] {
                run_.time("open_hashed_key_table, file", s, run_.rows(),
                          [&] { table = open(Rows, RG_MODE_READ, true); });
                run_.time("close_table, file", s, run_.rows(), close);
            });
    }

    void copying(state s)
    {
        run_.measure_rows("copy_table_by_name, file", s,
                          [&] { check(rg_copy_table_by_name_1(tree_, path(Rows), path(Copy), 1), "copy"); });
        if (!run_.wants("copy_table_by_handle, file"))
            return;
        rg_opaque_handle_t table = open(Rows, RG_MODE_READ, true);
        run_.measure_rows("copy_table_by_handle, file", s,
                          [&] { check(rg_copy_table_by_handle_1(table, path(Copy), 1), "copy"); });
        check(rg_close_table_1(table), "close");
    }

    void moving(state s)
    {
        const char * p_from = Rows;
        const char * p_to   = Moved;
        run_.measure_call("move_table_by_name, file", s, [&] {
            check(rg_move_table_by_name_1(tree_, path(p_from), path(p_to), 0), "move");
            std::swap(p_from, p_to);
        });
        if (p_to == Rows)
            check(rg_move_table_by_name_1(tree_, path(Moved), path(Rows), 0), "move back");
        if (!run_.wants("move_table_by_handle, file"))
            return;
        run_.repeat_long([&] {
            check(rg_copy_table_by_name_1(tree_, path(Rows), path(Memory), 0), "copy to memory");
            rg_opaque_handle_t table;
            check(rg_open_table_1(tree_, path(Memory), RG_MODE_READ, &table), "open");
            run_.time("move_table_by_handle, file", s, run_.rows(),
                      [&] { check(rg_move_table_by_handle_1(table, path(Moved), 1), "move"); });
            check(rg_close_table_1(table), "close");
        });
        check(rg_delete_table_1(tree_, path(Moved)), "delete");
    }

    // Each one rewrites the file; the first two take each other back.
    void column_changes(state s)
    {
        rg_column_t   added = column(Added, KT_INT64, false);
        kt_char_ptr_t names[]{Added};
        const auto    change = [&](std::string_view curve, auto action) {
            run_.time(curve, s, run_.rows(), [&] { check(action(), "change columns"); });
        };
        if (run_.wants("add_columns, file") || run_.wants("delete_columns, file"))
            run_.repeat_long([&] {
                change("add_columns, file", [&] { return rg_add_columns_1(table_, &added, 1); });
                change("delete_columns, file", [&] { return rg_delete_columns_1(table_, names, 1); });
            });
        if (run_.wants("change_column_name, file"))
            run_.repeat_long([&] {
                change("change_column_name, file", [&] { return rg_change_column_name_1(table_, Count, Added); });
                change("change_column_name, file", [&] { return rg_change_column_name_1(table_, Added, Count); });
            });
        if (run_.wants("change_default_value, file"))
            run_.repeat_long([&] {
                change("change_default_value, file",
                       [&] { return rg_change_default_value_1(table_, Count, value_of(7)); });
            });
    }

    void deleting(state s)
    {
        run_.time("delete_table, file", s, run_.rows(), [&] { check(rg_delete_table_1(tree_, path(Rows)), "delete"); });
        if (std::filesystem::exists(directory_ + "/copy"))
            check(rg_delete_table_1(tree_, path(Copy)), "delete");
    }

    run &              run_;
    std::string        directory_;
    fsync_file         disk_;
    rg_opaque_handle_t tree_    = nullptr;
    rg_opaque_handle_t table_   = nullptr;
    std::uint64_t      next_id_ = 0;
};

} // namespace

void measure_files(run & r)
{
    files f(r);
    f.measure_calls();
    if (!r.wants_any_of({family::files, family::transactions}) && !r.wants("move_table_by_name, file"))
        return;
    f.measure_life(state::fresh);
    if (r.rows() <= r.chosen().most_versioned)
        f.measure_life(state::versions);
}

} // namespace growth
