// SPDX-License-Identifier: MIT
// Opening and closing tables in memory: modes, control, references, and how transient tables outlive their handles.
#include <search.h>
#include <sys/wait.h>
#include <unistd.h>

#include "parts.h"
#include "rg_i_tree.h"
#include "support/allocations.h"

using namespace kt_test;

namespace
{

std::vector<rg_column_t> columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("v", KT_INT64)};
}

kt_int32_t open_code(rg_opaque_handle_t tree, const std::string & path, kt_int32_t mode)
{
    kt_int32_t               rc     = -1;
    const rg_opaque_handle_t handle = open_table(tree, path, mode, &rc);
    if (rc == 0) {
        EXPECT_EQ(rg_close_table_1(handle), 0);
    } else {
        EXPECT_EQ(error_code(), rc);
    }
    return rc;
}

kt_int32_t create_code(rg_opaque_handle_t tree, const std::string & path, kt_int32_t mode)
{
    kt_int32_t rc = -1;
    create_table(tree, path, columns(), mode, &rc);
    return rc;
}

// The value of a row, or -1 with a failure noted.
kt_int64_t value_of(rg_opaque_handle_t table, kt_uint32_t id)
{
    kt_value_t result = int64(-1);
    EXPECT_EQ(rg_get_field_by_key_1(table, uint32(id), text("v"), &result), 0) << error_text();
    return result.val_int64;
}

kt_int32_t open_hashed_code(rg_opaque_handle_t tree, const std::string & path, kt_int32_t mode,
                            rg_opaque_handle_t * p_handle)
{
    return rg_open_hashed_key_table_1(tree, text(path), mode, 1024, hash_uint32, compare_uint32, p_handle);
}

} // namespace

// ---- Modes ----

TEST(opening, takes_modes_1_2_3_6_and_7_and_refuses_the_others)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(rg_close_table_1(table), 0);
    for (const kt_int32_t mode : {1, 2, 3, 6, 7})
        EXPECT_EQ(open_code(tree, "t", mode), 0) << mode;
    for (const kt_int32_t mode : {0, 4, 5, -1, 8, 9, 10, 1 << 30, INT32_MIN})
        EXPECT_EQ(open_code(tree, "t", mode), RG_E_INVALID_MODE) << mode;
}

TEST(opening, in_mode_3_is_as_in_2_and_in_7_as_in_6)
{
    open_tree tree;
    ASSERT_EQ(rg_close_table_1(create_table(tree, "t", columns(), RG_MODE_WRITE)), 0);
    const struct {
        kt_int32_t  mode;
        kt_uint32_t table_mode, implicit;
    } expected[] = {{1, 1, 1}, {2, 2, 1}, {3, 2, 1}, {6, 2, 0}, {7, 2, 0}};
    for (const auto & e : expected) {
        const rg_opaque_handle_t handle = open_table(tree, "t", e.mode);
        EXPECT_EQ(object(handle).mode, e.table_mode) << e.mode;
        EXPECT_EQ(object(handle).implicitly_controlled, e.implicit) << e.mode;
        ASSERT_EQ(rg_close_table_1(handle), 0);
    }
}

TEST(creating, takes_any_mode_from_0_to_7_and_always_writes)
{
    open_tree tree;
    for (kt_int32_t mode = 0; mode <= 7; ++mode) {
        const rg_opaque_handle_t handle = create_table(tree, "t" + std::to_string(mode), columns(), mode);
        ASSERT_NE(handle, nullptr);
        EXPECT_EQ(object(handle).mode, static_cast<kt_uint32_t>(RG_MODE_WRITE));
        EXPECT_EQ(object(handle).implicitly_controlled, mode < 4 ? 1u : 0u) << mode;
    }
    for (const kt_int32_t mode : {-1, 8, INT32_MIN, INT32_MAX}) {
        EXPECT_EQ(create_code(tree, "x", mode), RG_E_INVALID_MODE) << mode;
        EXPECT_EQ(error_code(), RG_E_INVALID_MODE);
    }
}

// ---- Arguments ----

TEST(opening, checks_handle_result_and_mode_in_this_order)
{
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(rg_open_table_1(nullptr, text("t"), 0, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_open_table_1(tree, text("t"), 0, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_open_table_1(tree, nullptr, 0, &handle), RG_E_INVALID_MODE);
    EXPECT_EQ(rg_open_table_1(tree, nullptr, 1, &handle), RG_E_INVALID_PATH);
    EXPECT_EQ(rg_open_table_1(tree, text("a b"), 1, &handle), RG_E_INVALID_PATH);
    EXPECT_EQ(handle, nullptr);
}

TEST(creating, checks_handle_result_mode_path_and_columns_in_this_order)
{
    open_tree                tree;
    std::vector<rg_column_t> none_is_key = {column("v", KT_INT64)};
    rg_opaque_handle_t       handle      = nullptr;
    EXPECT_EQ(rg_create_table_1(nullptr, text("t"), none_is_key.data(), 1, 9, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_create_table_1(tree, text("t"), none_is_key.data(), 1, 9, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_create_table_1(tree, nullptr, none_is_key.data(), 1, 9, &handle), RG_E_INVALID_MODE);
    EXPECT_EQ(rg_create_table_1(tree, nullptr, none_is_key.data(), 1, 2, &handle), RG_E_INVALID_PATH);
    EXPECT_EQ(error_code(), RG_E_INVALID_PATH);
    ASSERT_NE(create_table(tree, "t", columns(), 2), nullptr);
    EXPECT_EQ(rg_create_table_1(tree, text("t"), none_is_key.data(), 1, 2, &handle), RG_E_TABLE_EXISTS);
    EXPECT_EQ(rg_create_table_1(tree, text("u"), none_is_key.data(), 1, 2, &handle), RG_E_KEY_EXPECTED);
    EXPECT_EQ(handle, nullptr);
}

TEST(a_hashed_table, needs_buckets_and_both_functions_ahead_of_everything_else)
{
    open_tree                tree;
    std::vector<rg_column_t> list   = columns();
    rg_opaque_handle_t       handle = nullptr;
    for (const rg_opaque_handle_t t : {static_cast<rg_opaque_handle_t>(tree), rg_opaque_handle_t{nullptr}}) {
        EXPECT_EQ(
            rg_create_hashed_key_table_1(t, text("t"), list.data(), 2, 2, 0, hash_uint32, compare_uint32, &handle),
            RG_E_NULL_POINTER);
        EXPECT_EQ(rg_create_hashed_key_table_1(t, text("t"), list.data(), 2, 2, 8, nullptr, compare_uint32, &handle),
                  RG_E_NULL_POINTER);
        EXPECT_EQ(rg_create_hashed_key_table_1(t, text("t"), list.data(), 2, 2, 8, hash_uint32, nullptr, &handle),
                  RG_E_NULL_POINTER);
        EXPECT_EQ(rg_open_hashed_key_table_1(t, text("t"), 2, 0, hash_uint32, compare_uint32, &handle),
                  RG_E_NULL_POINTER);
        EXPECT_EQ(rg_open_hashed_key_table_1(t, text("t"), 2, 8, nullptr, compare_uint32, &handle), RG_E_NULL_POINTER);
        EXPECT_EQ(rg_open_hashed_key_table_1(t, text("t"), 2, 8, hash_uint32, nullptr, &handle), RG_E_NULL_POINTER);
        EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    }
    EXPECT_EQ(handle, nullptr);
}

TEST(a_hash_table, that_no_table_takes_is_closed_on_every_early_failure)
{
    // The leak checker of the sanitizers is what looks.
    open_tree                tree;
    std::vector<rg_column_t> list   = columns();
    rg_opaque_handle_t       handle = nullptr;
    const auto create = [&](rg_opaque_handle_t t, const char * p_path, kt_int32_t mode, rg_opaque_handle_t * p_result) {
        return rg_create_hashed_key_table_1(t, text(p_path), list.data(), 2, mode, 1024, hash_uint32, compare_uint32,
                                            p_result);
    };
    EXPECT_EQ(create(nullptr, "t", 2, &handle), RG_E_INVALID_HANDLE);
    EXPECT_EQ(create(tree, "t", 2, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(create(tree, "t", 99, &handle), RG_E_INVALID_MODE);
    EXPECT_EQ(create(tree, "t t", 2, &handle), RG_E_INVALID_PATH);
    EXPECT_EQ(create(tree, "t", 2, &handle), 0);
    EXPECT_EQ(create(tree, "t", 2, &handle), RG_E_TABLE_EXISTS);
    rg_opaque_handle_t other = nullptr;
    EXPECT_EQ(open_hashed_code(nullptr, "t", 2, &other), RG_E_INVALID_HANDLE);
    EXPECT_EQ(open_hashed_code(tree, "t", 2, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(open_hashed_code(tree, "t", 4, &other), RG_E_INVALID_MODE);
    EXPECT_EQ(open_hashed_code(tree, "t t", 2, &other), RG_E_INVALID_PATH);
    EXPECT_EQ(open_hashed_code(tree, "u", 2, &other), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(open_hashed_code(tree, "t", 6, &other), RG_E_EXCLUSIVE_OPEN);
    EXPECT_EQ(other, nullptr);
}

TEST(a_transient_table, that_nobody_made_doesnt_exist)
{
    open_tree tree;
    EXPECT_EQ(open_code(tree, "t", RG_MODE_WRITE), RG_E_NO_SUCH_TABLE);
}

TEST(a_forked_child, cant_create_but_can_open)
{
    open_tree tree;
    ASSERT_NE(create_table(tree, "t", columns(), RG_MODE_WRITE), nullptr);
    ku_set_no_error_1();
    const pid_t child = fork();
    if (child == 0) {
        std::vector<rg_column_t> list   = columns();
        rg_opaque_handle_t       handle = nullptr;
        const bool               right =
            rg_create_table_1(tree, text("u"), list.data(), 2, 2, &handle) == RG_E_INTERNAL && error_code() == 0 &&
            rg_create_hashed_key_table_1(tree, text("u"), list.data(), 2, 2, 0, nullptr, nullptr, &handle) ==
                RG_E_INTERNAL &&
            error_code() == 0 && rg_open_table_1(tree, text("t"), 2, &handle) == 0 && rg_close_table_1(handle) == 0;
        _exit(right ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

// ---- Joining a table that is open ----

TEST(a_second_writer, of_the_same_control_shares_the_object)
{
    open_tree                tree;
    const rg_opaque_handle_t first  = create_table(tree, "t", columns(), RG_MODE_WRITE);
    const rg_opaque_handle_t second = open_table(tree, "t", RG_MODE_WRITE);
    EXPECT_EQ(first, second);
    EXPECT_EQ(object(first).references, 2u);
    ASSERT_EQ(add_row(second, {{"id", uint32(1)}, {"v", int64(10)}}), 0);
    EXPECT_EQ(value_of(first, 1), 10);
}

TEST(a_second_writer, of_the_other_control_is_refused_and_the_first_handle_stays_as_it_was)
{
    for (const kt_int32_t first_mode : {2, 6}) {
        open_tree                tree;
        const rg_opaque_handle_t first = create_table(tree, "t", columns(), first_mode);
        EXPECT_EQ(open_code(tree, "t", first_mode == 2 ? 6 : 2), RG_E_EXCLUSIVE_OPEN);
        EXPECT_EQ(object(first).references, 1u);
        EXPECT_EQ(object(first).implicitly_controlled, first_mode == 2 ? 1u : 0u);
        EXPECT_EQ(object(first).mode, static_cast<kt_uint32_t>(RG_MODE_WRITE));
        EXPECT_EQ(open_code(tree, "t", first_mode), 0);
        EXPECT_EQ(add_row(first, {{"id", uint32(1)}}), 0);
    }
}

TEST(a_reader, that_joins_a_writer_can_update_since_the_mode_is_the_tables)
{
    for (const kt_int32_t writer_mode : {2, 6}) {
        open_tree                tree;
        const rg_opaque_handle_t writer = create_table(tree, "t", columns(), writer_mode);
        const rg_opaque_handle_t reader = open_table(tree, "t", RG_MODE_READ);
        EXPECT_EQ(reader, writer);
        EXPECT_EQ(object(writer).implicitly_controlled, writer_mode == 2 ? 1u : 0u) << "a reader changes nothing";
        EXPECT_EQ(add_row(reader, {{"id", uint32(1)}}), 0);
        ASSERT_EQ(rg_close_table_1(writer), 0);
        EXPECT_EQ(add_row(reader, {{"id", uint32(2)}}), 0);
    }
}

TEST(a_writer, that_joins_readers_of_a_transient_table_makes_everybody_a_writer)
{
    open_tree tree;
    ASSERT_EQ(rg_close_table_1(create_table(tree, "t", columns(), RG_MODE_WRITE)), 0);
    const rg_opaque_handle_t reader = open_table(tree, "t", RG_MODE_READ);
    EXPECT_EQ(add_row(reader, {{"id", uint32(1)}}), RG_E_ACCESS);
    EXPECT_EQ(open_table(tree, "t", RG_MODE_READ), reader);
    EXPECT_EQ(add_row(reader, {{"id", uint32(1)}}), RG_E_ACCESS) << "two readers are no writer";

    const rg_opaque_handle_t writer = open_table(tree, "t", RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    EXPECT_EQ(writer, reader);
    EXPECT_EQ(object(reader).references, 3u);
    EXPECT_EQ(object(reader).implicitly_controlled, 0u);
    EXPECT_EQ(add_row(reader, {{"id", uint32(1)}}), 0);
}

// ---- Closing ----

TEST(a_transient_table, outlives_its_handles_with_its_rows)
{
    open_tree          tree;
    rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(7)}, {"v", int64(70)}}), 0);
    ASSERT_NE(open_table(tree, "t", RG_MODE_READ), nullptr);
    ASSERT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(object(table).references, 1u);
    ASSERT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(object(table).references, 0u) << "it waits in the tree";
    EXPECT_EQ(create_code(tree, "t", RG_MODE_WRITE), RG_E_TABLE_EXISTS);

    table = open_table(tree, "t", RG_MODE_READ);
    EXPECT_EQ(object(table).references, 1u);
    EXPECT_EQ(value_of(table, 7), 70);
}

TEST(a_transient_table, takes_mode_and_control_from_its_first_opener)
{
    open_tree          tree;
    rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_EQ(rg_close_table_1(table), 0);
    table = open_table(tree, "t", RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    EXPECT_EQ(object(table).implicitly_controlled, 0u);
    ASSERT_EQ(rg_close_table_1(table), 0);
    table = open_table(tree, "t", RG_MODE_READ);
    EXPECT_EQ(object(table).mode, static_cast<kt_uint32_t>(RG_MODE_READ));
    EXPECT_EQ(object(table).implicitly_controlled, 1u);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_ACCESS);
}

TEST(a_transient_table, keeps_what_is_pending_while_nobody_has_it_open)
{
    open_tree          tree;
    rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", int64(5)}}), 0);
    ASSERT_EQ(rg_close_table_1(table), 0);
    table = open_table(tree, "t", RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(value_of(table, 1), 5);
}

TEST(a_handle, that_is_null_cant_be_closed)
{
    EXPECT_EQ(rg_close_table_1(nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
}

TEST(closing, destroys_a_transient_table_that_has_left_its_tree)
{
    open_tree                tree;
    auto *                   p_tree = static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    const rg_opaque_handle_t first  = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_NE(tdelete(first, &p_tree->p_tables, rg_i_table_compare), nullptr); // as a deletion does
    // That the object goes is what the leak checker looks at.
    EXPECT_EQ(rg_close_table_1(first), 0);
    EXPECT_EQ(open_code(tree, "t", RG_MODE_READ), RG_E_NO_SUCH_TABLE);
}

TEST(closing, takes_this_very_object_out_of_the_tree_and_leaves_another_of_its_name)
{
    open_tree                tree;
    auto *                   p_tree = static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    const rg_opaque_handle_t first  = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_NE(tdelete(first, &p_tree->p_tables, rg_i_table_compare), nullptr);
    const rg_opaque_handle_t second = create_table(tree, "t", columns(), RG_MODE_WRITE);
    ASSERT_NE(first, second);
    ASSERT_EQ(add_row(second, {{"id", uint32(1)}, {"v", int64(2)}}), 0);
    EXPECT_EQ(rg_close_table_1(first), 0);
    EXPECT_EQ(open_table(tree, "t", RG_MODE_WRITE), second);
    EXPECT_EQ(value_of(second, 1), 2);
}

TEST(closing, an_unnamed_table_destroys_it_whatever_its_references)
{
    open_tree      tree;
    auto *         p_tree  = static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    rg_i_table_t * p_table = nullptr;
    auto           list    = columns();
    ASSERT_EQ(rg_i_create_transient_table(p_tree, nullptr, list.data(), 2, 0, nullptr, &p_table), 0);
    ASSERT_NE(tsearch(p_table, &p_tree->p_unnamed_tables, rg_i_pointer_compare), nullptr);
    p_table->references = 5;
    EXPECT_EQ(rg_close_table_1(p_table), 0);
    EXPECT_EQ(p_tree->p_unnamed_tables, nullptr);
}

TEST(a_hashed_open, of_a_table_in_memory_keeps_what_the_table_has)
{
    open_tree                tree;
    const rg_opaque_handle_t hashed = create_hashed_table(tree, "hashed", columns(), RG_MODE_WRITE);
    const rg_opaque_handle_t plain  = create_table(tree, "plain", columns(), RG_MODE_WRITE);
    rg_hash_table_t * const  p_kept = object(hashed).p_rows_hash_table;
    rg_opaque_handle_t       handle = nullptr;
    ASSERT_EQ(open_hashed_code(tree, "hashed", 2, &handle), 0);
    EXPECT_EQ(handle, hashed);
    EXPECT_EQ(object(hashed).p_rows_hash_table, p_kept);
    ASSERT_EQ(open_hashed_code(tree, "plain", 2, &handle), 0);
    EXPECT_EQ(handle, plain);
    EXPECT_EQ(object(plain).p_rows_hash_table, nullptr);
    EXPECT_EQ(error_code(), 0);
}

// ---- Locks and memory ----

TEST(a_tree, that_cant_be_locked_keeps_everything_as_it_was)
{
    open_tree                tree;
    const rg_opaque_handle_t table  = create_table(tree, "t", columns(), RG_MODE_WRITE);
    rg_opaque_handle_t       handle = nullptr;
    std::vector<rg_column_t> list   = columns();
    const kt_char_ptr_t      p_t    = text("t"); // takes a mutex of its own
    const kt_char_ptr_t      p_u    = text("u");
    {
        fault_scope faults;
        fail_call(call::mutex_lock, 1, EINVAL);
        EXPECT_EQ(rg_open_table_1(tree, p_t, 2, &handle), RG_E_SYSTEM_CALL);
        fail_call(call::mutex_lock, 1, EINVAL);
        EXPECT_EQ(rg_close_table_1(table), RG_E_SYSTEM_CALL);
        fail_call(call::mutex_lock, 2, EINVAL); // behind ForkMutex
        EXPECT_EQ(rg_create_table_1(tree, p_u, list.data(), 2, 2, &handle), RG_E_SYSTEM_CALL);
        EXPECT_EQ(error_code(), RG_E_SYSTEM_CALL);
    }
    EXPECT_EQ(handle, nullptr);
    EXPECT_EQ(object(table).references, 1u);
    EXPECT_EQ(create_code(tree, "u", 2), 0);
    EXPECT_EQ(open_code(tree, "t", 2), 0);
}

TEST(a_table, that_cant_be_locked_isnt_joined)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), RG_MODE_WRITE);
    const kt_char_ptr_t      p_t   = text("t"); // takes a mutex of its own
    fault_scope              faults;
    fail_call(call::mutex_lock, 2, EINVAL); // behind the tree's
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(rg_open_table_1(tree, p_t, 2, &handle), RG_E_SYSTEM_CALL);
    EXPECT_EQ(error_code(), RG_E_SYSTEM_CALL);
    EXPECT_EQ(handle, nullptr);
    EXPECT_EQ(object(table).references, 1u);
}

TEST(creating_in_a_tree, without_memory_leaves_the_tree_as_it_was)
{
    open_tree tree;
    fail_each_allocation(
        [&] {
            std::vector<rg_column_t> list   = {column("id", KT_UINT32, RG_PRIMARY_KEY),
                                               column("s", KT_CHAR_PTR, RG_STANDARD, string(std::string(9000, 'x')))};
            rg_opaque_handle_t       handle = nullptr;
            const kt_int32_t rc = rg_create_hashed_key_table_1(tree, text("t"), list.data(), 2, 2, 1024, hash_uint32,
                                                               compare_uint32, &handle);
            EXPECT_EQ(handle != nullptr, rc == 0);
            return rc;
        },
        [&](kt_int32_t rc) { EXPECT_EQ(open_code(tree, "t", RG_MODE_READ), rc == 0 ? 0 : RG_E_NO_SUCH_TABLE); });
}

TEST(a_hashed_open, without_memory_leaves_the_table_as_it_was)
{
    open_tree                tree;
    const rg_opaque_handle_t table  = create_table(tree, "t", columns(), RG_MODE_WRITE);
    rg_opaque_handle_t       handle = nullptr;
    fail_each_allocation([&] { return open_hashed_code(tree, "t", 2, &handle); },
                         [&](kt_int32_t rc) { EXPECT_EQ(object(table).references, rc == 0 ? 2u : 1u); });
}
