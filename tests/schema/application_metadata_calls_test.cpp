// SPDX-License-Identifier: MIT
// The two calls for the application's binary, and how it takes part in a table's transactions.
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

#include "rg_i_table.h"
#include "support/allocations.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicit_write = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

std::vector<rg_column_t> columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY)};
}

kt_int32_t set_blob(rg_opaque_handle_t table, const std::string & data)
{
    std::vector<char> memory(sizeof(kt_binary_t) + data.size());
    auto *            p_binary = reinterpret_cast<kt_binary_t *>(memory.data());
    p_binary->length           = static_cast<kt_uint32_t>(data.size());
    std::memcpy(p_binary->data, data.data(), data.size());
    return rg_set_application_metadata_1(table, p_binary);
}

// The binary, or the code in angle brackets.
std::string get_blob(rg_opaque_handle_t table)
{
    kt_binary_t *    p_binary = nullptr;
    const kt_int32_t rc       = rg_get_application_metadata_1(table, &p_binary);
    if (rc != 0) {
        EXPECT_EQ(error_code(), rc);
        EXPECT_EQ(p_binary, nullptr);
        return "<" + std::to_string(rc) + ">";
    }
    std::string result(reinterpret_cast<char *>(p_binary->data), p_binary->length);
    std::free(p_binary);
    return result;
}

} // namespace

TEST(the_applications_binary, that_was_never_set_is_no_such_key)
{
    open_tree tree;
    EXPECT_EQ(get_blob(create_table(tree, "t", columns(), 2)), "<202>");
    EXPECT_EQ(error_message_index(), 19);
}

TEST(the_applications_binary, is_committed_at_once_on_an_implicitly_controlled_table)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(set_blob(table, std::string("by\0tes", 6)), 0);
    EXPECT_EQ(get_blob(table), std::string("by\0tes", 6));
    const rg_i_table_t & object = *static_cast<rg_i_table_t *>(table);
    EXPECT_EQ(object.ready_for_commit, 0u);
    EXPECT_EQ(object.change_counter, 2u);
    ASSERT_EQ(set_blob(table, "other"), 0);
    EXPECT_EQ(get_blob(table), "other");
}

TEST(the_applications_binary, shows_its_committed_version_while_a_set_is_pending)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    ASSERT_EQ(set_blob(table, "first"), 0);
    EXPECT_EQ(get_blob(table), "<202>") << "there is no committed version yet";
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(get_blob(table), "<202>");
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(get_blob(table), "first");
    ASSERT_EQ(set_blob(table, "second"), 0);
    EXPECT_EQ(get_blob(table), "first");
}

TEST(the_applications_binary, shows_its_pending_version_where_uncommitted_updates_are_visible)
{
    setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "", 1);
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE");
    ASSERT_EQ(set_blob(table, "pending"), 0);
    EXPECT_EQ(get_blob(table), "pending");
}

TEST(the_applications_binary, set_for_the_first_time_is_removed_by_an_abort)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    ASSERT_EQ(set_blob(table, "first"), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(get_blob(table), "<202>");
    EXPECT_EQ(static_cast<rg_i_table_t *>(table)->p_application_metadata->total_elements, 0u);
}

TEST(the_applications_binary, comes_back_with_an_abort)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    ASSERT_EQ(set_blob(table, "old"), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_commit_1(table), 0);
    ASSERT_EQ(set_blob(table, "new"), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(get_blob(table), "old");
}

TEST(the_applications_binary, of_length_0_stands_in_8_bytes_of_the_commit_record)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("m", dir.path());
    const rg_opaque_handle_t table = create_table(tree, "m/t", columns(), RG_MODE_WRITE);
    const size_t             empty = read_file(dir.file("t")).size();
    ASSERT_EQ(set_blob(table, ""), 0);
    EXPECT_EQ(get_blob(table), "");
    const bytes file = read_file(dir.file("t"));
    ASSERT_EQ(file.size(), empty + 24 + 4 + 8);
    EXPECT_EQ(to_hex(bytes(file.end() - 20, file.end())),
              to_hex(from_hex("02 00 00 00 00 00 00 00" // the change counter
                              "01 00 00 00"             // one element
                              "00 00 00 00 00 00 00 00")));
}

TEST(the_applications_binary, stands_in_the_file_and_commits_with_the_rows)
{
    temp_dir dir;
    {
        open_tree tree;
        tree.mount("m", dir.path());
        const rg_opaque_handle_t table = create_table(tree, "m/t", columns(), explicit_write);
        ASSERT_EQ(set_blob(table, "with the row"), 0);
        ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
        ASSERT_EQ(rg_apply_1(table, 0), 0);
        ASSERT_EQ(rg_commit_1(table), 0);
        ASSERT_EQ(set_blob(table, "never committed"), 0);
        ASSERT_EQ(rg_apply_1(table, 0), 0);
    }
    open_tree tree;
    tree.mount("m", dir.path());
    EXPECT_EQ(get_blob(open_table(tree, "m/t", RG_MODE_READ)), "with the row");
}

TEST(the_applications_binary, whose_apply_fails_is_taken_back_on_an_implicitly_controlled_table)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("m", dir.path());
    const rg_opaque_handle_t table = create_table(tree, "m/t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(set_blob(table, "committed"), 0);
    fault_scope faults;
    fail_call(call::fsync, 1, EIO);
    EXPECT_EQ(set_blob(table, "lost"), RG_E_SYSTEM_CALL);
    reset_calls();
    unlink(("reginfo_pid." + std::to_string(getpid())).c_str()); // the witness of a failed sync
    EXPECT_EQ(get_blob(table), "committed");
}

TEST(setting_the_applications_binary, between_apply_and_commit_goes_through_with_explicit_control_alone)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(set_blob(table, "late"), 0);
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(get_blob(table), "late");
}

TEST(setting_the_applications_binary, on_a_table_open_for_reading_is_refused)
{
    open_tree tree;
    ASSERT_EQ(rg_close_table_1(create_table(tree, "t", columns(), RG_MODE_WRITE)), 0);
    const rg_opaque_handle_t table = open_table(tree, "t", RG_MODE_READ);
    EXPECT_EQ(set_blob(table, "x"), RG_E_ACCESS);
    EXPECT_EQ(error_code(), RG_E_ACCESS);
    EXPECT_EQ(rg_set_application_metadata_1(table, nullptr), RG_E_NULL_POINTER) << "a missing binary goes ahead";
    EXPECT_EQ(get_blob(table), "<202>");
}

TEST(the_calls_for_the_applications_binary, test_the_handle_and_then_the_binary)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    EXPECT_EQ(rg_set_application_metadata_1(nullptr, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_get_application_metadata_1(nullptr, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_set_application_metadata_1(table, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_application_metadata_1(table, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    kt_binary_t binary{};
    EXPECT_EQ(rg_set_application_metadata_1(nullptr, &binary), RG_E_INVALID_HANDLE);
    EXPECT_EQ(set_blob(table, "usable all the same"), 0);
}

TEST(the_calls_for_the_applications_binary, in_a_forked_child_read_and_dont_set)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(set_blob(table, "inherited"), 0);
    ku_set_no_error_1();
    const pid_t child = fork();
    if (child == 0)
        _exit(set_blob(table, "x") == RG_E_INTERNAL && rg_set_application_metadata_1(table, nullptr) == RG_E_INTERNAL &&
                      rg_set_application_metadata_1(nullptr, nullptr) == RG_E_INTERNAL && error_code() == 0 &&
                      get_blob(table) == "inherited"
                  ? 0
                  : 1);
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST(setting_the_applications_binary, without_memory_changes_nothing)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    fail_each_allocation([&] { return set_blob(table, "x"); },
                         [&](kt_int32_t rc) {
                             EXPECT_EQ(static_cast<rg_i_table_t *>(table)->p_application_metadata->total_elements,
                                       rc == 0 ? 1u : 0u);
                         });
}
