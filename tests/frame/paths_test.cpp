// SPDX-License-Identifier: MIT
// Registry paths: their syntax, what they resolve to, and the directories of a path.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <string>

#include "frame/rg_i_trace.h"
#include "rg_i_tree.h"
#include "support/faults.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

kt_int32_t check(const std::string & path)
{
    return rg_i_check_path_syntax(text(path));
}

struct resolved {
    kt_int32_t  rc;
    std::string name;
    kt_uint32_t persistent;
    bool        is_own_pointer;
};

resolved resolve(rg_opaque_handle_t tree, const std::string & path)
{
    const kt_char_ptr_t p_path     = text(path);
    kt_char_ptr_t       p_name     = nullptr;
    kt_uint32_t         persistent = 99;
    const kt_int32_t    rc         = rg_i_resolve_path(static_cast<rg_i_tree_t *>(tree), p_path, &p_name, &persistent);
    resolved            result{rc, rc == 0 ? p_name : "", persistent, p_name == p_path};
    if (rc == 0 && persistent != 0)
        std::free(p_name);
    return result;
}

void expect_transient(rg_opaque_handle_t tree, const std::string & path)
{
    const resolved r = resolve(tree, path);
    EXPECT_EQ(r.rc, 0) << path;
    EXPECT_EQ(r.persistent, 0u) << path;
    EXPECT_TRUE(r.is_own_pointer) << path;
}

void expect_file(rg_opaque_handle_t tree, const std::string & path, const std::string & file)
{
    const resolved r = resolve(tree, path);
    EXPECT_EQ(r.rc, 0) << path;
    EXPECT_EQ(r.persistent, 512u) << path;
    EXPECT_EQ(r.name, file);
}

kt_int32_t make_directories(const std::string & path)
{
    std::string      writable = path;
    const kt_int32_t rc       = rg_i_create_all_directories_in_path(writable.data());
    EXPECT_EQ(writable, path); // restored, whatever happened
    return rc;
}

} // namespace

// ---- Syntax ----

TEST(path_syntax, letters_digits_underscores_and_slashes_are_valid)
{
    for (const char * path : {"/", "/a", "/a/b", "a", "a/b", "/a/", "_", "/A_1/b_2/", "0"})
        EXPECT_EQ(check(path), 0) << path;
}

TEST(path_syntax, a_path_of_255_characters_is_valid_and_one_of_256_is_not)
{
    EXPECT_EQ(check(std::string(255, 'a')), 0);
    EXPECT_EQ(check(std::string(256, 'a')), 102);
    EXPECT_EQ(check(std::string(100000, 'a')), 102);
}

TEST(path_syntax, the_empty_path_is_refused)
{
    EXPECT_EQ(check(""), 102);
    EXPECT_EQ(error_message_index(), 9);
    EXPECT_EQ(error_text(), "2605-102  is an invalid pathname.\n");
}

TEST(path_syntax, spaces_dots_hyphens_and_commas_are_refused)
{
    for (const char * path : {"/a b", "/a\tb", "/a\n", "/a.b", "/a-b", "/a,b", "/./a", "/../a", "/a/.", "/a/..", "/a*",
                              "/a\\b", "/a:b", "\x7f", "/a\x01"}) {
        EXPECT_EQ(check(path), 102) << path;
        EXPECT_EQ(error_code(), 102);
        EXPECT_EQ(error_text(), "2605-102 " + std::string(path) + " is an invalid pathname.\n");
    }
}

TEST(path_syntax, bytes_above_127_are_refused_in_the_c_locale)
{
    EXPECT_EQ(check("/\xc3\xa4"), 102);
    EXPECT_EQ(check("/\xff"), 102);
}

TEST(path_syntax, an_empty_component_is_refused)
{
    EXPECT_EQ(check("//"), 102);
    EXPECT_EQ(check("/a//b"), 102);
    EXPECT_EQ(check("/a//"), 102);
}

TEST(path_syntax, a_null_path_is_refused_by_name)
{
    EXPECT_EQ(rg_i_check_path_syntax(nullptr), 102);
    EXPECT_EQ(error_text(), "2605-102 <NULL POINTER> is an invalid pathname.\n");
}

// ---- Resolving ----

TEST(resolving_a_path, without_mount_points_every_path_is_transient_and_the_callers_own_pointer)
{
    const open_tree tree;
    for (const char * path : {"/a", "a", "/a/b", "/a/"})
        expect_transient(tree, path);
}

TEST(resolving_a_path, a_bad_path_is_refused)
{
    const open_tree tree;
    EXPECT_EQ(resolve(tree, "/a b").rc, 102);
}

TEST(resolving_a_path, below_a_mount_point_is_a_file_with_commas_for_slashes)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    expect_file(tree, "/m/t", dir.path() + "/t");
    expect_file(tree, "/m/a/b", dir.path() + "/a,b");
    expect_file(tree, "/m/a/b/c", dir.path() + "/a,b,c");
    expect_file(tree, "/m/a/", dir.path() + "/a,");
}

TEST(resolving_a_path, the_mount_point_with_a_slash_is_the_directory_itself)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    expect_file(tree, "/m/", dir.path() + "/");
}

TEST(resolving_a_path, the_mount_point_without_a_slash_is_transient)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    expect_transient(tree, "/m");
}

TEST(resolving_a_path, a_path_that_only_shares_letters_with_a_mount_point_is_not_under_it)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    expect_transient(tree, "/mt");
    expect_transient(tree, "/mt/t");
    expect_transient(tree, "m/t");
}

TEST(resolving_a_path, without_a_leading_slash_is_found_under_a_mount_point_without_one)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("m", dir.path());
    expect_file(tree, "m/t", dir.path() + "/t");
    expect_transient(tree, "/m/t");
}

TEST(resolving_a_path, each_of_many_mount_points_is_found)
{
    const temp_dir dir;
    open_tree      tree;
    for (int i = 0; i < 50; ++i)
        tree.mount("/m" + std::to_string(i), dir.file(std::to_string(i)));
    for (int i = 0; i < 50; ++i)
        expect_file(tree, "/m" + std::to_string(i) + "/t", dir.file(std::to_string(i)) + "/t");
    expect_transient(tree, "/m50/t");
}

TEST(resolving_a_path, below_a_mount_point_that_was_made_above_another_one_is_found_too)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/a/b", dir.file("lower"));
    tree.mount("/a", dir.file("upper"));
    expect_file(tree, "/a/A", dir.file("upper") + "/A"); // to the left of the lower one
    expect_file(tree, "/a/z", dir.file("upper") + "/z"); // to the right of it
    EXPECT_EQ(resolve(tree, "/a/b/t").persistent, 512u); // under both: whichever the search meets first
}

TEST(resolving_a_path, a_failed_allocation_gives_12_and_leaves_the_outputs)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    const fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    kt_char_t        untouched;
    kt_char_ptr_t    p_name     = &untouched;
    kt_uint32_t      persistent = 99;
    const kt_int32_t rc         = rg_i_resolve_path(static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree)),
                                                    const_cast<kt_char_ptr_t>("/m/t"), &p_name, &persistent);
    EXPECT_EQ(rc, 12);
    EXPECT_EQ(error_code(), 12);
    EXPECT_EQ(p_name, &untouched);
    EXPECT_EQ(persistent, 99u);
}

TEST(resolving_a_path, leaves_room_for_the_suffix_of_a_rewrite_file)
{
    const temp_dir dir;
    open_tree      tree;
    tree.mount("/m", dir.path());
    kt_char_ptr_t p_name     = nullptr;
    kt_uint32_t   persistent = 0;
    ASSERT_EQ(rg_i_resolve_path(static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree)), text("/m/t"),
                                &p_name, &persistent),
              0);
    std::strcat(p_name, ".rewrite"); // the sanitizer sees it if there is no room
    EXPECT_EQ(p_name, dir.file("t.rewrite"));
    std::free(p_name);
}

// ---- Directories ----

TEST(making_directories, makes_each_directory_of_the_path_with_mode_0755)
{
    const temp_dir dir;
    const mode_t   before = umask(0);
    EXPECT_EQ(make_directories(dir.file("a/b/c")), 0);
    umask(before);
    for (const char * made : {"a", "a/b", "a/b/c"}) {
        struct stat status;
        ASSERT_EQ(stat(dir.file(made).c_str(), &status), 0) << made;
        EXPECT_EQ(status.st_mode & 07777, 0755u) << made;
    }
}

TEST(making_directories, what_exists_is_no_failure)
{
    const temp_dir dir;
    EXPECT_EQ(make_directories(dir.path()), 0);
    EXPECT_EQ(make_directories(dir.file("a//b/")), 0);
    EXPECT_EQ(make_directories(dir.file("a//b/")), 0);
    EXPECT_TRUE(std::filesystem::is_directory(dir.file("a/b")));
}

TEST(making_directories, a_full_file_system_gives_16_and_the_directories_made_before_stay)
{
    const temp_dir dir;
    std::string    path = dir.file("a/b/c");
    {
        const fault_scope faults;
        const auto        slashes = static_cast<unsigned>(std::count(path.begin(), path.end(), '/'));
        fail_call(call::mkdir, slashes - 1, ENOSPC); // at the last slash: "a/b"; the first one cuts nothing
        EXPECT_EQ(rg_i_create_all_directories_in_path(path.data()), 16);
    }
    EXPECT_EQ(path, dir.file("a/b/c"));
    EXPECT_EQ(error_code(), 16);
    EXPECT_EQ(error_message_index(), 30);
    EXPECT_TRUE(file_exists(dir.file("a")));
    EXPECT_FALSE(file_exists(dir.file("a/b")));
}

TEST(making_directories, any_other_failure_gives_10_with_the_name_of_the_call)
{
    const temp_dir dir;
    write_file(dir.file("file"), {});
    EXPECT_EQ(make_directories(dir.file("file/below")), 10);
    EXPECT_EQ(error_message_index(), 1);
    EXPECT_EQ(error_text().find("2605-010 The mkdir system call unexpectedly returned an errno of 20 to the "
                                "rg_i_create_all_directories_in_path function near line "),
              0u);
}

TEST(making_directories, an_empty_path_is_refused_by_the_system)
{
    EXPECT_EQ(make_directories(""), 10);
    EXPECT_EQ(error_message_index(), 1);
}

// ---- The order of the search trees ----

TEST(comparing, pointers_are_ordered_by_unsigned_address)
{
    const auto at = [](std::uintptr_t address) { return reinterpret_cast<const void *>(address); };
    EXPECT_EQ(rg_i_pointer_compare(at(1), at(2)), -1);
    EXPECT_EQ(rg_i_pointer_compare(at(2), at(2)), 0);
    EXPECT_EQ(rg_i_pointer_compare(at(2), at(1)), 1);
    EXPECT_EQ(rg_i_pointer_compare(at(UINTPTR_MAX), at(1)), 1);
}

TEST(comparing, a_path_equals_every_mount_point_that_it_begins_with)
{
    rg_i_mount_point_t mount{text("/m/"), nullptr, 512};
    EXPECT_EQ(rg_i_string_to_mount_point_compare("/m/t", &mount), 0);
    EXPECT_EQ(rg_i_string_to_mount_point_compare("/m/", &mount), 0);
    EXPECT_LT(rg_i_string_to_mount_point_compare("/m", &mount), 0);
    EXPECT_GT(rg_i_string_to_mount_point_compare("/n/t", &mount), 0);
}

TEST(comparing, for_an_unmount_only_the_whole_name_is_equal)
{
    rg_i_mount_point_t mount{text("/m/"), nullptr, 512};
    EXPECT_EQ(rg_i_string_to_mount_point_delete_compare("/m/", &mount), 0);
    EXPECT_GT(rg_i_string_to_mount_point_delete_compare("/m/t", &mount), 0);
}

TEST(comparing, mount_points_are_ordered_by_name)
{
    rg_i_mount_point_t a{text("/a/"), nullptr, 512};
    rg_i_mount_point_t b{text("/b/"), nullptr, 512};
    rg_i_mount_point_t other_a{text("/a/"), nullptr, 512};
    EXPECT_LT(rg_i_mount_point_compare(&a, &b), 0);
    EXPECT_GT(rg_i_mount_point_compare(&b, &a), 0);
    EXPECT_EQ(rg_i_mount_point_compare(&a, &other_a), 0);
}
