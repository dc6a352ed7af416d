// SPDX-License-Identifier: MIT
// Clearing up the rewrite files that crashes leave behind.
#include "storage/table_files.h"
#include "support/allocations.h"

namespace kt_test
{

namespace
{

kt_int32_t repair(rg_opaque_handle_t tree, std::vector<std::string> names)
{
    std::vector<kt_char_ptr_t> pointers;
    for (const std::string & name : names)
        pointers.push_back(text(name));
    return rg_repair_tables_1(tree, pointers.data(), static_cast<kt_uint32_t>(pointers.size()));
}

} // namespace

TEST(repairing_tables, removes_a_stray_rewrite_file_and_touches_no_table)
{
    registry_at r;
    ASSERT_EQ(rg_close_table_1(r.create()), 0);
    const bytes before = read_file(r.path);
    write_file(r.rewrite, {1, 2, 3});
    EXPECT_EQ(repair(r.tree, {"/r/t"}), 0);
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(read_file(r.path), before);
}

TEST(repairing_tables, a_table_without_a_rewrite_file_is_left_as_it_is)
{
    registry_at r;
    ASSERT_EQ(rg_close_table_1(r.create()), 0);
    const bytes before = read_file(r.path);
    EXPECT_EQ(repair(r.tree, {"/r/t"}), 0);
    EXPECT_EQ(read_file(r.path), before);
}

TEST(repairing_tables, a_name_that_does_not_exist_is_a_success)
{
    registry_at r;
    write_file(r.dir.file("gone.rewrite"), {1});
    EXPECT_EQ(repair(r.tree, {"/r/nothing", "/r/gone", "/under/no/mount_point"}), 0);
    EXPECT_FALSE(file_exists(r.dir.file("gone.rewrite")));
}

TEST(repairing_tables, an_invalid_path_in_the_third_place_ends_the_list_there)
{
    registry_at r;
    for (const char * name : {"a", "b", "d"})
        write_file(r.dir.file(std::string(name) + ".rewrite"), {1});
    EXPECT_EQ(repair(r.tree, {"/r/a", "/r/b", "/r/c.c", "/r/d"}), RG_E_INVALID_PATH);
    EXPECT_EQ(error_code(), RG_E_INVALID_PATH);
    EXPECT_FALSE(file_exists(r.dir.file("a.rewrite")));
    EXPECT_FALSE(file_exists(r.dir.file("b.rewrite")));
    EXPECT_TRUE(file_exists(r.dir.file("d.rewrite")));
}

TEST(repairing_tables, a_file_that_can_not_be_removed_looks_like_one_that_is_not_there)
{
    registry_at r;
    write_file(r.rewrite, {1});
    fault_scope faults;
    fail_call(call::unlink, 1, EACCES);
    EXPECT_EQ(repair(r.tree, {"/r/t"}), 0);
    EXPECT_TRUE(file_exists(r.rewrite));
}

TEST(repairing_tables, no_names_are_a_success_that_clears_the_error_record)
{
    open_tree tree;
    EXPECT_EQ(rg_repair_tables_1(tree, nullptr, 1), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_repair_tables_1(tree, nullptr, 0), 0);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(rg_repair_tables_1(nullptr, nullptr, 0), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
    kt_char_ptr_t no_name = nullptr;
    EXPECT_EQ(rg_repair_tables_1(tree, &no_name, 1), RG_E_INVALID_PATH);
}

TEST(repairing_tables, takes_the_file_of_a_rewrite_that_is_not_committed_and_its_commit_fails)
{
    registry_at        r;
    rg_opaque_handle_t table = r.create(RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    ASSERT_EQ(add(table, 1, 10), 0);
    ASSERT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    ASSERT_TRUE(file_exists(r.rewrite));
    EXPECT_EQ(repair(r.tree, {"/r/t"}), 0);
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(rg_commit_1(table), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("rename"), std::string::npos);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(repairing_tables, without_memory_leaves_the_files_where_they_are)
{
    registry_at r;
    write_file(r.rewrite, {1});
    fail_each_allocation([&] { return repair(r.tree, {"/r/t"}); },
                         [&](kt_int32_t rc) { EXPECT_EQ(file_exists(r.rewrite), rc != 0); });
}

} // namespace kt_test
