// SPDX-License-Identifier: MIT
// Listing tables under a path: from the directory of a mount point, or from the tree's memory.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "support/faults.h"
#include "support/registry.h"

namespace
{

using namespace kt_test;

const std::vector<rg_column_t> key_only = {column("id", KT_UINT32, RG_PRIMARY_KEY)};

struct listing {
    kt_int32_t               rc = 0;
    std::vector<std::string> names; // sorted: the order of a listing is none
};

listing list(rg_opaque_handle_t tree, const std::string & path)
{
    listing         result;
    kt_char_ptr_t * p_list = nullptr;
    kt_uint32_t     count  = 0;
    result.rc              = rg_list_tables_1(tree, text(path), &p_list, &count);
    if (result.rc != 0)
        return result;
    EXPECT_NE(p_list, nullptr);
    result.names.assign(p_list, p_list + count);
    std::sort(result.names.begin(), result.names.end());
    EXPECT_EQ(rg_free_table_list_1(p_list, count), 0);
    return result;
}

using names = std::vector<std::string>;

TEST(listing_tables, a_mount_point_is_listed_with_or_without_its_trailing_slash)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    create_table(tree, "/m/a", key_only, RG_MODE_WRITE);
    create_table(tree, "/m/b", key_only, RG_MODE_WRITE);
    EXPECT_EQ(list(tree, "/m").names, (names{"/m/a", "/m/b"}));
    EXPECT_EQ(list(tree, "/m/").names, (names{"/m/a", "/m/b"}));
}

TEST(listing_tables, lock_files_rewrite_files_and_dot_files_are_not_shown)
{
    temp_dir dir;
    for (const char * name : {",Lock", "t.rewrite", ".hidden", "t"})
        write_file(dir.file(name), {});
    open_tree tree;
    tree.mount("/m", dir.path());
    EXPECT_EQ(list(tree, "/m").names, names{"/m/t"});
}

TEST(listing_tables, a_comma_in_a_file_name_comes_back_as_a_slash)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    create_table(tree, "/m/net/hosts", key_only, RG_MODE_WRITE);
    EXPECT_TRUE(file_exists(dir.file("net,hosts")));
    EXPECT_EQ(list(tree, "/m").names, names{"/m/net/hosts"});
    EXPECT_EQ(list(tree, "/m/net").names, names{"/m/net/hosts"});
}

TEST(listing_tables, a_path_below_a_mount_point_is_a_plain_prefix)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    for (const char * path : {"/m/net", "/m/network", "/m/other"})
        create_table(tree, path, key_only, RG_MODE_WRITE);
    EXPECT_EQ(list(tree, "/m/net").names, (names{"/m/net", "/m/network"}));
}

TEST(listing_tables, tables_of_memory_and_tables_of_files_never_mix)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    create_table(tree, "/m/file", key_only, RG_MODE_WRITE);
    create_table(tree, "/memory", key_only, RG_MODE_WRITE);
    create_table(tree, "/m", key_only, RG_MODE_WRITE);
    EXPECT_EQ(list(tree, "/m").names, names{"/m/file"});
    EXPECT_EQ(list(tree, "/").names, (names{"/m", "/memory"}));
    EXPECT_EQ(list(tree, dir.path()).rc, RG_E_INVALID_PATH) << "the directory's name isn't a registry path";
}

TEST(listing_tables, a_table_closed_by_all_its_openers_is_listed_while_it_is_in_the_tree)
{
    open_tree tree;
    EXPECT_EQ(rg_close_table_1(create_table(tree, "/t/waiting", key_only, RG_MODE_WRITE)), 0);
    EXPECT_EQ(list(tree, "/t").names, names{"/t/waiting"});
}

TEST(listing_tables, all_250_tables_come_though_the_list_starts_with_100)
{
    open_tree tree;
    names     made;
    for (int i = 0; i < 250; ++i) {
        made.push_back("/t/n" + std::to_string(i));
        create_table(tree, made.back(), key_only, RG_MODE_WRITE);
    }
    std::sort(made.begin(), made.end());
    EXPECT_EQ(list(tree, "/t").names, made);
}

TEST(listing_tables, nothing_to_list_is_a_success_with_a_list_of_none)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    for (const char * path : {"/m", "/m/x", "/nothing"}) {
        const listing result = list(tree, path);
        EXPECT_EQ(result.rc, 0) << path;
        EXPECT_TRUE(result.names.empty()) << path;
    }
}

TEST(listing_tables, wrong_arguments_are_refused_in_order)
{
    open_tree       tree;
    kt_char_ptr_t * p_list = nullptr;
    kt_uint32_t     count  = 7;
    EXPECT_EQ(rg_list_tables_1(nullptr, nullptr, &p_list, &count), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_list_tables_1(tree, nullptr, &p_list, &count), RG_E_INVALID_PATH);
    EXPECT_NE(error_text().find("<NULL POINTER>"), std::string::npos);
    EXPECT_EQ(rg_list_tables_1(tree, text("a b"), &p_list, &count), RG_E_INVALID_PATH);
    EXPECT_EQ(rg_list_tables_1(tree, text("/t"), nullptr, &count), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_list_tables_1(tree, text("/t"), &p_list, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(p_list, nullptr);
    EXPECT_EQ(count, 7u);
    EXPECT_EQ(rg_free_table_list_1(nullptr, 0), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
}

TEST(listing_tables, a_directory_that_cannot_be_read_gives_its_code)
{
    temp_dir          dir;
    const fault_scope faults;
    open_tree         tree;
    tree.mount("/m", dir.path());
    fail_call(call::opendir, 1, EACCES);
    EXPECT_EQ(list(tree, "/m").rc, RG_E_ACCESS);
    EXPECT_EQ(error_code(), RG_E_ACCESS);
    fail_call(call::opendir, 1, EMFILE);
    EXPECT_EQ(list(tree, "/m").rc, RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("opendir"), std::string::npos);
    EXPECT_EQ(list(tree, "/m").rc, 0);
}

// Both sources; each allocation fails in turn, those of growing the list among them.
TEST(listing_tables, without_memory_nothing_is_delivered_and_nothing_leaks)
{
    temp_dir dir;
    for (int i = 0; i < 120; ++i)
        write_file(dir.file("n" + std::to_string(i)), {});
    open_tree tree;
    tree.mount("/m", dir.path());
    for (int i = 0; i < 120; ++i)
        create_table(tree, "/t/n" + std::to_string(i), key_only, RG_MODE_WRITE);

    for (kt_char_ptr_t path : {text("/m"), text("/t")}) {
        unsigned nth = 1;
        for (;; ++nth) {
            const fault_scope faults;
            kt_char_ptr_t *   p_list = nullptr;
            kt_uint32_t       count  = 0;
            fail_call(call::allocation, nth, ENOMEM);
            const kt_int32_t rc = rg_list_tables_1(tree, path, &p_list, &count);
            if (!failed_as_asked(call::allocation)) {
                ASSERT_EQ(rc, 0);
                EXPECT_EQ(count, 120u);
                EXPECT_EQ(rg_free_table_list_1(p_list, count), 0);
                break;
            }
            ASSERT_EQ(rc, RG_E_NO_MEMORY) << nth;
            EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
            EXPECT_EQ(p_list, nullptr);
        }
        EXPECT_GT(nth, 120u);
    }
}

TEST(listing_tables, in_the_older_shape_the_entries_share_the_list)
{
    open_tree tree;
    create_table(tree, "/t/a", key_only, RG_MODE_WRITE);
    create_table(tree, "/t/b", key_only, RG_MODE_WRITE);
    rg_entry_metadata_t * p_entries = nullptr;
    kt_uint32_t           count     = 0;
    ASSERT_EQ(rg_i_get_directory_list_compat(tree, text("/t"), &p_entries, &count), 0);
    ASSERT_EQ(count, 2u);
    for (kt_uint32_t i = 0; i < count; ++i) {
        EXPECT_EQ(p_entries[i].name, p_entries[0].p_table_list[i]);
        EXPECT_EQ(p_entries[i].type, rg_entry_t{RG_TABLE});
        EXPECT_EQ(p_entries[i].storage, rg_storage_t{RG_UNKNOWN_STORAGE});
        EXPECT_EQ(p_entries[i].p_table_list, p_entries[0].p_table_list);
    }
    EXPECT_EQ(rg_i_free_directory_list_compat(p_entries, count), 0);
}

TEST(listing_tables, in_the_older_shape_no_tables_are_null_and_0)
{
    open_tree             tree;
    rg_entry_metadata_t   entry{};
    rg_entry_metadata_t * p_entries = &entry;
    kt_uint32_t           count     = 7;
    ASSERT_EQ(rg_i_get_directory_list_compat(tree, text("/t"), &p_entries, &count), 0);
    EXPECT_EQ(p_entries, nullptr);
    EXPECT_EQ(count, 0u);
    EXPECT_EQ(rg_i_free_directory_list_compat(nullptr, 0), 0);
}

TEST(listing_tables, in_the_older_shape_failures_are_passed_on_and_directories_do_nothing)
{
    open_tree             tree;
    rg_entry_metadata_t * p_entries = nullptr;
    kt_uint32_t           count     = 0;
    EXPECT_EQ(rg_i_get_directory_list_compat(nullptr, text("/t"), &p_entries, &count), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_i_get_directory_list_compat(tree, text("/t"), nullptr, &count), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_i_create_directory_compat(), 0);
    EXPECT_EQ(rg_i_delete_directory_compat(), 0);

    create_table(tree, "/t/a", key_only, RG_MODE_WRITE);
    const fault_scope faults;
    fail_call(call::allocation, 4, ENOMEM); // behind the form with the slash, the list and its one entry
    EXPECT_EQ(rg_i_get_directory_list_compat(tree, text("/t"), &p_entries, &count), RG_E_NO_MEMORY);
    EXPECT_TRUE(failed_as_asked(call::allocation));
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
}

} // namespace
