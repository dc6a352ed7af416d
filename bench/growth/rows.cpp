// SPDX-License-Identifier: MIT
// rows: calls that look at every row of a table in memory, and what becomes of the copies that they make.
#include <fcntl.h>
#include <unistd.h>

#include <cstdio>

#include "common/require.h"
#include "groups.h"

namespace growth
{

namespace
{

// Sends standard output, or a stream of our own, to where nobody reads it.
class silence
{
  public:
    silence()
    {
        std::fflush(stdout);
        old_           = dup(STDOUT_FILENO);
        const int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
        require(old_ >= 0 && null >= 0 && dup2(null, STDOUT_FILENO) >= 0, "can't silence the output");
        close(null);
    }
    ~silence()
    {
        std::fflush(stdout);
        dup2(old_, STDOUT_FILENO);
        close(old_);
    }
    silence(const silence &)             = delete;
    silence & operator=(const silence &) = delete;

  private:
    int old_;
};

void selections(run & r, table_in_memory & t)
{
    const auto select = [&](std::string_view curve, const char * p_criteria, std::size_t expected) {
        rg_opaque_handle_t copy = nullptr;
        r.measure_rows(
            curve, t.how(), [&] { check(rg_select_1(t.handle(), nullptr, 0, &copy, path(p_criteria)), "select"); },
            [&] {
                require(expected == 0 || rows_of(copy) == expected, "a selection lacks rows");
                check(rg_close_table_1(copy), "close");
            });
    };
    select("select, all", nullptr, r.rows());
    select("select, a hundredth", "count < 10", 0);
    std::vector<std::uint32_t> rows;
    r.measure_rows("get_selected_rows_v", t.how(),
                   [&] { rows = list(t.handle(), criteria_of(filter::three_conditions)); });
    r.measure_rows(
        "delete_rows, a hundredth", t.how(), [&] { check(rg_delete_rows_1(t.handle(), path("count < 10")), "delete"); },
        [&] { check(rg_abort_1(t.handle()), "abort"); });
}

void copies(run & r, table_in_memory & t)
{
    constexpr const char * copy = "/copy";
    if (r.wants("copy_table_by_handle") || r.wants("delete_rows, all"))
        r.repeat_long([&] {
            r.time("copy_table_by_handle", t.how(), r.rows(),
                   [&] { check(rg_copy_table_by_handle_1(t.handle(), path(copy), 0), "copy"); });
            rg_opaque_handle_t table;
            check(rg_open_table_1(t.tree(), path(copy), explicit_control, &table), "open");
            r.time("delete_rows, all", t.how(), r.rows(), [&] {
                check(rg_delete_rows_1(table, nullptr), "delete");
                apply_and_commit(table);
            });
            require(rows_of(table) == 0, "rows are left behind");
            check(rg_close_table_1(table), "close");
            check(rg_delete_table_1(t.tree(), path(copy)), "delete");
        });
    if (r.wants("copy_table_by_name") || r.wants("delete_table"))
        r.repeat_long([&] {
            r.time("copy_table_by_name", t.how(), r.rows(),
                   [&] { check(rg_copy_table_by_name_1(t.tree(), path(t.name), path(copy), 0), "copy"); });
            r.time("delete_table", t.how(), r.rows(),
                   [&] { check(rg_delete_table_1(t.tree(), path(copy)), "delete"); });
        });
}

void creations(run & r, table_in_memory & t)
{
    rg_opaque_handle_t table = nullptr;
    r.measure_rows(
        "create_hashed_key_table", t.how(), [&] { table = create(t.tree(), "/new", r.rows(), true); },
        [&] {
            check(rg_close_table_1(table), "close");
            check(rg_delete_table_1(t.tree(), path("/new")), "delete");
        });
}

void dumps(run & r, table_in_memory & t)
{
    if (r.rows() > r.chosen().most_dumped)
        return;
    const silence quiet;
    r.measure_rows("dump_table", t.how(), [&] {
        check(rg_i_dump_table(static_cast<rg_i_table_struct_t *>(t.handle()), stdout, ~kt_uint64_t{0}), "dump");
    });
    r.measure_rows("dump_tree", t.how(),
                   [&] { check(rg_i_dump_tree(static_cast<rg_i_tree_struct_t *>(t.tree())), "dump"); });
}

} // namespace

void measure_rows(run & r, table_in_memory & t)
{
    if (!r.wants_any_of({family::rows}))
        return;
    selections(r, t);
    copies(r, t);
    creations(r, t);
    dumps(r, t);
}

} // namespace growth
