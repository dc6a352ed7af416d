// SPDX-License-Identifier: MIT
// Mounting a directory at a registry path, and unmounting it.
#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "rg_i_tree.h"
#include "support/faults.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

kt_int32_t mount(rg_opaque_handle_t tree, const std::string & registry_path, const std::string & directory,
                 kt_int32_t create = 1)
{
    return rg_mount_local_tree_1(tree, text(registry_path), text(directory), create);
}

kt_int32_t unmount(rg_opaque_handle_t tree, const std::string & registry_path)
{
    return rg_unmount_local_tree_1(tree, text(registry_path));
}

rg_i_tree_t & inside(rg_opaque_handle_t tree)
{
    return *static_cast<rg_i_tree_t *>(tree);
}

// Whether a table at the path would be a file.
bool is_persistent(rg_opaque_handle_t tree, const std::string & registry_path)
{
    kt_char_ptr_t p_name     = nullptr;
    kt_uint32_t   persistent = 0;
    EXPECT_EQ(rg_i_resolve_path(&inside(tree), text(registry_path), &p_name, &persistent), 0);
    if (persistent != 0)
        std::free(p_name);
    return persistent != 0;
}

// The only mount point of the tree.
const rg_i_mount_point_t & only_mount_point(rg_opaque_handle_t tree)
{
    // The root node's first word is its element.
    return **static_cast<rg_i_mount_point_t **>(inside(tree).p_mount_points);
}

void expect_refused(kt_int32_t rc, kt_int32_t code, kt_int32_t message_index)
{
    EXPECT_EQ(rc, code);
    EXPECT_EQ(error_code(), code);
    EXPECT_EQ(error_message_index(), message_index);
}

} // namespace

// ---- Mounting ----

TEST(mounting, gives_the_paths_below_a_directory)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_FALSE(is_persistent(tree, "/m/t"));
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    EXPECT_EQ(error_code(), 0);
    EXPECT_TRUE(is_persistent(tree, "/m/t"));
}

TEST(mounting, keeps_copies_of_both_paths_and_a_block_size_of_512)
{
    const temp_dir  dir;
    const open_tree tree;
    std::string     registry_path = "/m";
    std::string     directory     = dir.path();
    ASSERT_EQ(rg_mount_local_tree_1(tree, registry_path.data(), directory.data(), 1), 0);
    registry_path = "xx";
    directory     = "yy";
    EXPECT_STREQ(only_mount_point(tree).p_name, "/m/");
    EXPECT_EQ(only_mount_point(tree).p_filesystem_path, dir.path());
    EXPECT_EQ(only_mount_point(tree).block_size, 512u);
}

TEST(mounting, makes_the_directory_whatever_create_says)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m0", dir.file("a/b"), 0), 0);
    EXPECT_EQ(mount(tree, "/m1", dir.file("c/d"), 1), 0);
    EXPECT_EQ(mount(tree, "/m2", dir.file("e/f"), -7), 0);
    for (const char * made : {"a/b", "c/d", "e/f"})
        EXPECT_TRUE(std::filesystem::is_directory(dir.file(made))) << made;
}

TEST(mounting, takes_a_path_without_a_leading_slash)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "m", dir.path()), 0);
    EXPECT_TRUE(is_persistent(tree, "m/t"));
}

TEST(mounting, the_same_path_twice_is_refused)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    expect_refused(mount(tree, "/m", dir.file("other")), 207, 24);
    EXPECT_EQ(only_mount_point(tree).p_filesystem_path, dir.path());
}

TEST(mounting, below_a_mount_point_is_refused)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    expect_refused(mount(tree, "/m/a", dir.file("other")), 207, 24);
    expect_refused(mount(tree, "/m/", dir.file("other")), 207, 24);
    EXPECT_FALSE(file_exists(dir.file("other")));
}

TEST(mounting, above_a_mount_point_is_accepted)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m/a", dir.file("lower")), 0);
    EXPECT_EQ(mount(tree, "/m", dir.file("upper")), 0);
    EXPECT_TRUE(is_persistent(tree, "/m/a/t"));
    EXPECT_TRUE(is_persistent(tree, "/m/b"));
}

TEST(mounting, at_a_path_below_the_upper_of_two_is_refused_wherever_the_lower_stands)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m/a", dir.file("lower")), 0);
    EXPECT_EQ(mount(tree, "/m", dir.file("upper")), 0);
    expect_refused(mount(tree, "/m/A", dir.file("other")), 207, 24);
    expect_refused(mount(tree, "/m/z", dir.file("other")), 207, 24);
}

TEST(mounting, a_path_with_a_trailing_slash_gets_two_and_never_matches)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m/", dir.path()), 0);
    EXPECT_STREQ(only_mount_point(tree).p_name, "/m//");
    EXPECT_FALSE(is_persistent(tree, "/m/"));
    EXPECT_FALSE(is_persistent(tree, "/m/t"));
    expect_refused(mount(tree, "/m/", dir.path()), 207, 24); // the name is taken all the same
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
}

TEST(mounting, a_bad_path_is_refused_and_nothing_is_made)
{
    const temp_dir  dir;
    const open_tree tree;
    expect_refused(mount(tree, "/a b", dir.file("d")), 102, 9);
    expect_refused(rg_mount_local_tree_1(tree, nullptr, text(dir.file("d")), 1), 102, 9);
    EXPECT_FALSE(file_exists(dir.file("d")));
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}

TEST(mounting, a_null_directory_is_refused_ahead_of_the_path)
{
    const open_tree tree;
    expect_refused(rg_mount_local_tree_1(tree, text("/a b"), nullptr, 1), 101, 8);
}

TEST(mounting, a_null_tree_is_refused_ahead_of_all_else)
{
    expect_refused(rg_mount_local_tree_1(nullptr, nullptr, nullptr, 1), 100, 7);
}

TEST(mounting, a_directory_that_cannot_be_made_gives_10_and_mounts_nothing)
{
    const temp_dir  dir;
    const open_tree tree;
    write_file(dir.file("file"), {});
    expect_refused(mount(tree, "/m", dir.file("file/below")), 10, 1);
    expect_refused(mount(tree, "/m", ""), 10, 1);
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}

TEST(mounting, on_a_full_file_system_gives_16_and_mounts_nothing)
{
    const temp_dir    dir;
    const open_tree   tree;
    const fault_scope faults;
    fail_call(call::mkdir, 1, ENOSPC);
    expect_refused(mount(tree, "/m", dir.file("d")), 16, 30);
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}

TEST(mounting, a_failed_allocation_leaves_nothing_behind)
{
    const temp_dir      dir;
    const open_tree     tree;
    const kt_char_ptr_t p_registry_path = text("/m");
    const kt_char_ptr_t p_directory     = text(dir.path());
    unsigned            failures        = 0;
    for (;; ++failures) {
        const fault_scope faults;
        fail_call(call::allocation, failures + 1, ENOMEM);
        const kt_int32_t rc = rg_mount_local_tree_1(tree, p_registry_path, p_directory, 1);
        if (!failed_as_asked(call::allocation)) {
            EXPECT_EQ(rc, 0);
            break;
        }
        expect_refused(rc, 12, 3);
        EXPECT_EQ(inside(tree).p_mount_points, nullptr);
        EXPECT_EQ(inside(tree).lock.lock_count, 0);
    }
    EXPECT_EQ(failures, 5u); // the writable copy, the record, its two texts, the node
}

TEST(mounting, a_lock_that_fails_gives_10)
{
    const temp_dir      dir;
    const open_tree     tree;
    const kt_char_ptr_t p_registry_path = text("/m");
    const kt_char_ptr_t p_directory     = text(dir.path());
    const fault_scope   faults;
    fail_call(call::mutex_lock, 2, EDEADLK); // behind the one of all updates
    expect_refused(rg_mount_local_tree_1(tree, p_registry_path, p_directory, 1), 10, 1);
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
    EXPECT_EQ(pthread_mutex_trylock(&ForkMutex), 0);
    pthread_mutex_unlock(&ForkMutex);
}

TEST(mounting, at_the_very_name_of_a_transient_table_is_refused)
{
    const temp_dir  dir;
    const open_tree tree;
    ASSERT_NE(create_table(tree, "/m", {column("K", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE), nullptr);
    expect_refused(mount(tree, "/m", dir.file("d")), 201, 18);
    EXPECT_FALSE(file_exists(dir.file("d")));
    EXPECT_EQ(mount(tree, "/n", dir.path()), 0);
}

TEST(mounting, above_a_transient_table_leaves_its_handle_working)
{
    const temp_dir           dir;
    const open_tree          tree;
    const rg_opaque_handle_t table =
        create_table(tree, "/m/t", {column("K", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE);
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    EXPECT_EQ(add_row(table, {{"K", uint32(1)}}), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

// ---- Unmounting ----

TEST(unmounting, makes_the_paths_below_transient_again)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    EXPECT_EQ(unmount(tree, "/m"), 0);
    EXPECT_EQ(error_code(), 0);
    EXPECT_FALSE(is_persistent(tree, "/m/t"));
    EXPECT_TRUE(file_exists(dir.path()));
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
}

TEST(unmounting, with_a_trailing_slash_is_refused_and_the_mount_point_stays)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    expect_refused(unmount(tree, "/m/"), 208, 25);
    EXPECT_TRUE(is_persistent(tree, "/m/t"));
}

TEST(unmounting, a_path_below_the_mount_point_is_refused)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    expect_refused(unmount(tree, "/m/a"), 208, 25);
    EXPECT_TRUE(is_persistent(tree, "/m/t"));
}

TEST(unmounting, a_mount_made_with_a_trailing_slash_takes_the_same_text)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m/", dir.path()), 0);
    expect_refused(unmount(tree, "/m"), 208, 25);
    EXPECT_EQ(unmount(tree, "/m/"), 0);
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}

TEST(unmounting, without_any_mount_point_is_refused_ahead_of_the_path)
{
    const open_tree tree;
    expect_refused(unmount(tree, "/a b"), 208, 25);
    expect_refused(rg_unmount_local_tree_1(tree, nullptr), 208, 25);
}

TEST(unmounting, a_bad_path_is_refused)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    expect_refused(unmount(tree, "/a b"), 102, 9);
    expect_refused(rg_unmount_local_tree_1(tree, nullptr), 102, 9);
}

TEST(unmounting, a_null_tree_is_refused)
{
    expect_refused(rg_unmount_local_tree_1(nullptr, text("/m")), 100, 7);
}

TEST(unmounting, leaves_open_tables_working_and_a_later_mount_finds_them_again)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    const rg_opaque_handle_t table =
        create_table(tree, "/m/t", {column("K", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE);
    EXPECT_EQ(unmount(tree, "/m"), 0);
    EXPECT_EQ(add_row(table, {{"K", uint32(1)}}), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);

    kt_int32_t rc = 0;
    EXPECT_EQ(open_table(tree, "/m/t", RG_MODE_READ, &rc), nullptr);
    EXPECT_EQ(rc, 200);
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    const rg_opaque_handle_t again = open_table(tree, "/m/t", RG_MODE_READ);
    kt_value_t               value;
    EXPECT_EQ(rg_get_field_by_key_1(again, uint32(1), text("K"), &value), 0);
}

TEST(unmounting, each_of_many_mount_points_by_its_own_name)
{
    const temp_dir  dir;
    const open_tree tree;
    for (int i = 0; i < 30; ++i)
        EXPECT_EQ(mount(tree, "/m" + std::to_string(i), dir.path()), 0);
    for (int i = 29; i >= 0; --i) {
        EXPECT_EQ(unmount(tree, "/m" + std::to_string(i)), 0);
        for (int j = 0; j < 30; ++j)
            EXPECT_EQ(is_persistent(tree, "/m" + std::to_string(j) + "/t"), j < i);
    }
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}

TEST(unmounting, a_failed_allocation_leaves_the_mount_point)
{
    const temp_dir      dir;
    const open_tree     tree;
    const kt_char_ptr_t p_path = text("/m");
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    {
        const fault_scope faults;
        fail_call(call::allocation, 1, ENOMEM);
        expect_refused(rg_unmount_local_tree_1(tree, p_path), 12, 3);
    }
    EXPECT_TRUE(is_persistent(tree, "/m/t"));
    EXPECT_EQ(unmount(tree, "/m"), 0);
}

TEST(unmounting, a_failed_allocation_below_a_mount_point_leaks_nothing)
{
    const temp_dir      dir;
    const open_tree     tree;
    const kt_char_ptr_t p_path = text("/m/" + std::string(200, 'a')); // resolves to more than it is long itself
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    for (unsigned nth = 1; nth <= 2; ++nth) {
        const fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        expect_refused(rg_unmount_local_tree_1(tree, p_path), 12, 3);
    }
    expect_refused(rg_unmount_local_tree_1(tree, p_path), 208, 25);
}

TEST(unmounting, a_lock_that_fails_gives_10)
{
    const temp_dir  dir;
    const open_tree tree;
    EXPECT_EQ(mount(tree, "/m", dir.path()), 0);
    const kt_char_ptr_t p_path = text("/m");
    {
        const fault_scope faults;
        fail_call(call::mutex_lock, 1, EDEADLK); // the tree's: no other is taken
        expect_refused(rg_unmount_local_tree_1(tree, p_path), 10, 1);
    }
    EXPECT_TRUE(is_persistent(tree, "/m/t"));
}
