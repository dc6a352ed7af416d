// SPDX-License-Identifier: MIT
// Deleting tables: what goes, what handles that are still open keep, and what stays where a file can't be removed.
#include <sys/stat.h>

#include "storage/table_files.h"
#include "support/allocations.h"
#include "whole/rg_i_remove_table.h"

namespace kt_test
{

namespace
{

kt_int32_t delete_table(rg_opaque_handle_t tree, const std::string & path)
{
    return rg_delete_table_1(tree, text(path));
}

} // namespace

TEST(deleting_a_table, takes_a_transient_table_that_nobody_has_open_out_of_memory)
{
    open_tree tree;
    ASSERT_EQ(rg_close_table_1(create_table(tree, "/t", example_columns(), RG_MODE_WRITE)), 0);
    EXPECT_EQ(delete_table(tree, "/t"), 0);
    kt_int32_t rc = 0;
    EXPECT_EQ(open_table(tree, "/t", RG_MODE_READ, &rc), nullptr);
    EXPECT_EQ(rc, RG_E_NO_SUCH_TABLE);
}

TEST(deleting_a_table, removes_the_file_and_its_rewrite_file)
{
    registry_at r;
    ASSERT_EQ(rg_close_table_1(r.create()), 0);
    write_file(r.rewrite, {1, 2, 3});
    EXPECT_EQ(delete_table(r.tree, "/r/t"), 0);
    EXPECT_FALSE(file_exists(r.path));
    EXPECT_FALSE(file_exists(r.rewrite));
}

TEST(deleting_a_table, leaves_an_open_handle_working_in_memory_and_a_new_table_of_that_name_independent)
{
    registry_at r;
    for (const char * path : {"/r/t", "/transient"}) {
        rg_opaque_handle_t table = create_table(r.tree, path, example_columns(), RG_MODE_WRITE);
        ASSERT_EQ(add(table, 1, 10), 0);
        ASSERT_EQ(delete_table(r.tree, path), 0);
        EXPECT_EQ(file_exists(r.path), path != std::string("/r/t")); // of the new table, made before

        rg_opaque_handle_t later = create_table(r.tree, path, example_columns(), RG_MODE_WRITE);
        ASSERT_NE(later, nullptr) << path;
        EXPECT_EQ(add(table, 2, 20), 0);
        EXPECT_EQ(rows_of(table), (rows{{1, 10}, {2, 20}}));
        EXPECT_EQ(rows_of(later), rows{});
        EXPECT_EQ(rg_close_table_1(table), 0);
        EXPECT_EQ(add(later, 3, 30), 0);
        EXPECT_EQ(rg_close_table_1(later), 0);
        rg_opaque_handle_t again = open_table(r.tree, path, RG_MODE_READ);
        ASSERT_NE(again, nullptr) << path;
        EXPECT_EQ(rows_of(again), (rows{{3, 30}}));
        EXPECT_EQ(rg_close_table_1(again), 0);
    }
}

TEST(deleting_a_table, that_is_neither_in_the_tree_nor_in_the_directory_says_so)
{
    registry_at r;
    for (const char * path : {"/r/t", "/transient"}) {
        EXPECT_EQ(delete_table(r.tree, path), RG_E_NO_SUCH_TABLE);
        EXPECT_EQ(error_code(), RG_E_NO_SUCH_TABLE);
    }
}

TEST(deleting_a_table, whose_file_is_gone_takes_it_out_of_the_tree_all_the_same)
{
    registry_at        r;
    rg_opaque_handle_t table = r.create();
    std::filesystem::remove(r.path);
    EXPECT_EQ(delete_table(r.tree, "/r/t"), RG_E_NO_SUCH_TABLE);
    rg_opaque_handle_t later = r.create();
    EXPECT_NE(later, table);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rg_close_table_1(later), 0);
}

TEST(deleting_a_table, tells_why_a_file_could_not_be_removed_and_the_table_can_be_opened_anew)
{
    const std::pair<int, kt_int32_t> cases[]{
        {EACCES, RG_E_ACCESS}, {ENOENT, RG_E_NO_SUCH_TABLE}, {EBUSY, RG_E_SYSTEM_CALL}};
    for (const auto & [the_errno, code] : cases) {
        registry_at        r;
        rg_opaque_handle_t table = r.create();
        ASSERT_EQ(add(table, 1, 10), 0);
        fault_scope faults;
        fail_call(call::unlink, 1, the_errno);
        EXPECT_EQ(delete_table(r.tree, "/r/t"), code);
        EXPECT_EQ(error_code(), code);
        if (code == RG_E_SYSTEM_CALL) {
            EXPECT_NE(error_text().find("unlink"), std::string::npos);
        }
        EXPECT_EQ(rg_close_table_1(table), 0);
        rg_opaque_handle_t anew = r.open(RG_MODE_WRITE);
        ASSERT_NE(anew, nullptr);
        EXPECT_NE(anew, nullptr);
        EXPECT_EQ(rows_of(anew), (rows{{1, 10}}));
        EXPECT_EQ(rg_close_table_1(anew), 0);
    }
}

TEST(deleting_a_table, ignores_a_rewrite_file_that_can_not_be_removed)
{
    registry_at r;
    ASSERT_EQ(rg_close_table_1(r.create()), 0);
    write_file(r.rewrite, {1});
    fault_scope faults;
    fail_call(call::unlink, 2, EACCES);
    EXPECT_EQ(delete_table(r.tree, "/r/t"), 0);
    EXPECT_TRUE(file_exists(r.rewrite));
    EXPECT_FALSE(file_exists(r.path));
}

TEST(deleting_a_table, takes_no_file_lock)
{
    registry_at        r;
    rg_opaque_handle_t table = r.create();
    fault_scope        faults;
    EXPECT_EQ(delete_table(r.tree, "/r/t"), 0);
    EXPECT_EQ(calls_made(call::lockf), 0u);
    EXPECT_FALSE(file_exists(r.dir.file(",Lock")));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(deleting_a_table, refuses_what_is_no_path)
{
    open_tree tree;
    EXPECT_EQ(rg_delete_table_1(tree, nullptr), RG_E_INVALID_PATH);
    EXPECT_EQ(delete_table(tree, ""), RG_E_INVALID_PATH);
    EXPECT_EQ(delete_table(tree, "/a,b"), RG_E_INVALID_PATH);
    EXPECT_EQ(delete_table(nullptr, "/t"), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
}

TEST(deleting_a_table, without_memory_changes_nothing)
{
    registry_at r;
    ASSERT_EQ(rg_close_table_1(r.create()), 0);
    fail_each_allocation([&] { return delete_table(r.tree, "/r/t"); },
                         [&](kt_int32_t rc) { EXPECT_EQ(file_exists(r.path), rc != 0); });
}

// ---- The worker that moves use ----

TEST(removing_a_table, leaves_it_in_its_tree_if_its_file_can_not_be_removed)
{
    registry_at        r;
    rg_opaque_handle_t table = r.create();
    {
        fault_scope faults;
        fail_call(call::unlink, 1, EACCES);
        EXPECT_EQ(rg_i_remove_table(&object(table)), RG_E_ACCESS);
    }
    EXPECT_EQ(r.open(RG_MODE_WRITE), table);
    EXPECT_EQ(rg_i_remove_table(&object(table)), 0);
    EXPECT_FALSE(file_exists(r.path));
    kt_int32_t rc = 0;
    EXPECT_EQ(r.open(RG_MODE_WRITE, &rc), nullptr);
    EXPECT_EQ(rc, RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(add(table, 1, 1), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(removing_a_file_without_a_table, leaves_its_rewrite_file_to_a_repair)
{
    temp_dir dir;
    write_file(dir.file("t"), {1});
    write_file(dir.file("t.rewrite"), {2});
    EXPECT_EQ(rg_i_remove_persistent_table_without_handle(dir.file("t").c_str()), 0);
    EXPECT_FALSE(file_exists(dir.file("t")));
    EXPECT_TRUE(file_exists(dir.file("t.rewrite")));
    EXPECT_EQ(rg_i_remove_persistent_table_without_handle(dir.file("t").c_str()), RG_E_NO_SUCH_TABLE);
}

} // namespace kt_test
