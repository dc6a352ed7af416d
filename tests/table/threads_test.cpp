// SPDX-License-Identifier: MIT
// Threads that open, use and close the same tables of one tree.
#include <atomic>
#include <thread>

#include "parts.h"

using namespace kt_test;

namespace
{

std::vector<rg_column_t> columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("v", KT_INT64)};
}

template <class Work> void in_threads(unsigned count, Work work)
{
    std::vector<std::thread> threads;
    for (unsigned i = 0; i < count; ++i)
        threads.emplace_back([&work, i] { work(i); });
    for (std::thread & thread : threads)
        thread.join();
}

// Opens, looks at row 1 and closes, again and again. Returns how often something went wrong.
unsigned open_and_read(rg_opaque_handle_t tree, kt_char_ptr_t p_path, kt_char_ptr_t p_column, int rounds)
{
    unsigned failures = 0;
    for (int round = 0; round < rounds; ++round) {
        rg_opaque_handle_t handle = nullptr;
        kt_value_t         value  = int64(0);
        if (rg_open_table_1(tree, p_path, round % 2 == 0 ? RG_MODE_READ : RG_MODE_WRITE, &handle) != 0 ||
            rg_get_field_by_key_1(handle, uint32(1), p_column, &value) != 0 || value.val_int64 != 10 ||
            rg_close_table_1(handle) != 0)
            ++failures;
    }
    return failures;
}

} // namespace

TEST(threads_opening_a_table, share_one_object_and_count_their_opens)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", int64(10)}}), 0);
    const kt_char_ptr_t   p_path   = text("t");
    const kt_char_ptr_t   p_column = text("v");
    std::atomic<unsigned> failures = 0;
    in_threads(4, [&](unsigned) { failures += open_and_read(tree, p_path, p_column, 100); });
    EXPECT_EQ(failures, 0u);
    EXPECT_EQ(object(table).references, 1u);
}

TEST(threads_opening_a_table, with_a_file_read_it_or_share_it)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("m", dir.path());
    const rg_opaque_handle_t table = create_hashed_table(tree, "m/t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", int64(10)}}), 0);
    const kt_char_ptr_t   p_path   = text("m/t");
    const kt_char_ptr_t   p_column = text("v");
    std::atomic<unsigned> failures = 0;
    in_threads(4, [&](unsigned) { failures += open_and_read(tree, p_path, p_column, 50); });
    EXPECT_EQ(failures, 0u);
    ASSERT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rg_close_table_1(open_table(tree, "m/t", RG_MODE_READ)), 0) << "the last one has left the tree";
}

TEST(threads_creating_one_table, make_it_once)
{
    open_tree                  tree;
    std::atomic<unsigned>      made = 0;
    std::atomic<unsigned>      met  = 0;
    std::vector<kt_char_ptr_t> paths;
    for (int round = 0; round < 20; ++round)
        paths.push_back(text("t" + std::to_string(round)));
    in_threads(4, [&](unsigned) {
        for (const kt_char_ptr_t p_path : paths) {
            std::vector<rg_column_t> list   = columns();
            rg_opaque_handle_t       handle = nullptr;
            const kt_int32_t         rc     = rg_create_table_1(tree, p_path, list.data(), 2, RG_MODE_WRITE, &handle);
            made += rc == 0;
            met += rc == RG_E_TABLE_EXISTS;
        }
    });
    EXPECT_EQ(made, 20u);
    EXPECT_EQ(met, 60u);
}

TEST(threads_setting_the_applications_binary, run_one_at_a_time_beside_its_readers)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    kt_binary_t              zero{1, {0}};
    ASSERT_EQ(rg_set_application_metadata_1(table, &zero), 0);
    std::atomic<unsigned> failures = 0;
    in_threads(4, [&](unsigned thread) {
        for (int round = 0; round < 100; ++round) {
            if (thread % 2 == 0) {
                kt_binary_t binary{1, {static_cast<kt_uint8_t>(thread)}};
                failures += rg_set_application_metadata_1(table, &binary) != 0;
            } else {
                kt_binary_t * p_binary = nullptr;
                if (rg_get_application_metadata_1(table, &p_binary) != 0) {
                    ++failures;
                    continue;
                }
                failures += p_binary->length != 1 || p_binary->data[0] > 2;
                std::free(p_binary);
            }
        }
    });
    EXPECT_EQ(failures, 0u);
    EXPECT_EQ(object(table).change_counter, 202u);
}
