// SPDX-License-Identifier: MIT
// Transactions beside readers in one process.
#include <atomic>
#include <thread>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

std::vector<rg_column_t> balanced_columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("plus", KT_INT64), column("minus", KT_INT64)};
}

// The two fields of the row, whose sum is 0 in every committed state.
std::pair<std::int64_t, std::int64_t> read_row(rg_opaque_handle_t table)
{
    kt_char_ptr_t names[]  = {text("plus"), text("minus")};
    kt_value_t    plus     = int64(1);
    kt_value_t    minus    = int64(1);
    kt_value_t *  values[] = {&plus, &minus};
    EXPECT_EQ(rg_get_fields_by_key_1(table, uint32(1), names, values, 2), 0);
    return {plus.val_int64, minus.val_int64};
}

kt_int32_t write_row(rg_opaque_handle_t table, std::int64_t v)
{
    kt_char_ptr_t names[]  = {text("plus"), text("minus")};
    kt_value_t    plus     = int64(v);
    kt_value_t    minus    = int64(-v);
    kt_value_t *  values[] = {&plus, &minus};
    return rg_set_fields_by_key_1(table, uint32(1), names, values, 2);
}

} // namespace

TEST(threads_of_one_process, readers_see_whole_commits_of_appends_and_rewrites_and_nothing_of_aborts)
{
    registry_at        r;
    rg_opaque_handle_t table =
        create_hashed_table(r.tree, "/r/t", balanced_columns(), RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"plus", int64(0)}, {"minus", int64(0)}}), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_commit_1(table), 0);

    std::atomic<bool>        done{false};
    std::vector<std::thread> readers;
    for (int i = 0; i < 2; ++i)
        readers.emplace_back([&] {
            std::int64_t last = 0;
            while (!done) {
                const auto [plus, minus] = read_row(table);
                EXPECT_EQ(plus + minus, 0);
                EXPECT_GE(plus, last);
                EXPECT_LT(plus, 1000) << "pending and aborted values are over that";
                last = plus;
            }
        });
    for (std::int64_t v = 1; v <= 60; ++v) {
        EXPECT_EQ(write_row(table, 1000 + v), 0);
        EXPECT_EQ(rg_abort_1(table), 0);
        EXPECT_EQ(write_row(table, v), 0);
        if (v % 3 == 0) {
            object(table).file_length = 0xFFFFFFFF; // as if it were long and dead, so that the rule asks for a rewrite
        }
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(object(table).ready_for_commit, v % 3 == 0 ? 2u : 1u);
        EXPECT_EQ(rg_commit_1(table), 0);
    }
    done = true;
    for (std::thread & reader : readers)
        reader.join();
    EXPECT_EQ(read_row(table), (std::pair<std::int64_t, std::int64_t>{60, -60}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(threads_of_one_process, updates_of_several_threads_are_all_there_in_the_file)
{
    registry_at              r;
    rg_opaque_handle_t       table = create_hashed_table(r.tree, "/r/t", example_columns(), RG_MODE_WRITE);
    std::vector<std::thread> writers;
    for (std::uint32_t t = 0; t < 4; ++t)
        writers.emplace_back([&, t] {
            for (std::uint32_t i = 0; i < 25; ++i)
                EXPECT_EQ(add(table, t * 100 + i, i), 0);
        });
    for (std::thread & writer : writers)
        writer.join();
    EXPECT_EQ(rg_close_table_1(table), 0);
    const file_state state = state_in(r.dir.path());
    EXPECT_EQ(state.rows.size(), 100u);
    EXPECT_EQ(state.change_counter, 101u);
}
