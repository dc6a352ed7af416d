// SPDX-License-Identifier: MIT
// Rows as callers meet them: fixed and packed indices over additions, deletions, commits and aborts.
#include "parts.h"
#include "support/faults.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicit_write = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

std::vector<rg_column_t> columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("v", KT_INT64)};
}

std::vector<rg_column_t> checked_columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("v", KT_INT64)};
}

void add(rg_opaque_handle_t table, kt_uint32_t id)
{
    ASSERT_EQ(add_row(table, {{"id", uint32(id)}, {"v", int64(id * 10)}}), 0) << error_text();
}

void commit(rg_opaque_handle_t table)
{
    ASSERT_EQ(rg_apply_1(table, 0), 0) << error_text();
    ASSERT_EQ(rg_commit_1(table), 0) << error_text();
}

// The value at a fixed index as an uncommitted reader sees it; -1: no row.
kt_int64_t at_fixed(rg_opaque_handle_t table, kt_uint32_t index)
{
    kt_value_t       result = int64(0);
    const kt_int32_t rc = rg_get_field_by_fixed_index_and_visibility_1(table, static_cast<kt_int32_t>(index), text("v"),
                                                                       &result, 1, nullptr);
    return rc == 0 ? result.val_int64 : -1;
}

kt_int64_t at_packed(rg_opaque_handle_t table, kt_uint32_t index)
{
    kt_value_t       result = int64(0);
    const kt_int32_t rc =
        rg_get_field_by_index_and_visibility_1(table, static_cast<kt_int32_t>(index), text("v"), &result, 1, nullptr);
    return rc == 0 ? result.val_int64 : -1;
}

kt_uint32_t fixed_index_of(rg_opaque_handle_t table, kt_uint32_t id)
{
    kt_uint32_t index = 0xFFFFFFFFu;
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, uint32(id), &index), 0) << id << ": " << error_text();
    return index;
}

rg_row_state_t state_of(rg_opaque_handle_t table, kt_uint32_t fixed_index)
{
    return rg_i_get_row_state_for_fixed_index(&object(table), fixed_index);
}

} // namespace

TEST(fixed_indices, stay_valid_across_additions_with_changes_pending_on_both_lists)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", checked_columns(), explicit_write);
    for (kt_uint32_t id = 0; id < 100; ++id)
        add(table, id);
    commit(table);
    for (kt_uint32_t id = 0; id < 40; ++id) {
        kt_value_t value = int64(1000 + id);
        ASSERT_EQ(rg_set_field_by_fixed_index_1(table, static_cast<kt_int32_t>(id), text("v"), &value), 0);
    }
    for (kt_uint32_t id = 60; id < 100; ++id)
        ASSERT_EQ(rg_delete_row_by_index_1(table, id), 0);
    for (kt_uint32_t id = 100; id < 1000; ++id) // grows the index four times
        add(table, id);
    EXPECT_EQ(object(table).maximum_rows, 1600u);

    for (kt_uint32_t id = 0; id < 1000; ++id) {
        EXPECT_EQ(fixed_index_of(table, id), id);
        EXPECT_EQ(at_fixed(table, id), id < 40                ? 1000 + kt_int64_t{id}
                                       : id >= 60 && id < 100 ? -1
                                                              : kt_int64_t{id} * 10)
            << id;
    }
    commit(table);
    EXPECT_EQ(object(table).total_committed_rows, 960u);
    for (kt_uint32_t id = 0; id < 1000; ++id)
        EXPECT_EQ(state_of(table, id), id >= 60 && id < 100 ? RG_ROW_STATE_NO_ROW : RG_ROW_STATE_COMMITTED) << id;
}

TEST(the_hundred_and_first_row, doubles_a_fresh_index_and_gets_fixed_index_100)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", checked_columns(), explicit_write);
    for (kt_uint32_t id = 0; id < 100; ++id)
        add(table, id);
    EXPECT_EQ(object(table).maximum_rows, 100u);
    add(table, 100);
    EXPECT_EQ(object(table).maximum_rows, 200u);
    EXPECT_EQ(fixed_index_of(table, 100), 100u);
}

TEST(a_deleted_row, gives_its_packed_index_to_the_last_one_while_fixed_indices_stay)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_table(tree, "t", columns(), explicit_write);
    for (kt_uint32_t id = 1; id <= 3; ++id)
        add(table, id);
    commit(table);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    commit(table);
    EXPECT_EQ(object(table).total_committed_rows, 2u);
    EXPECT_EQ(at_packed(table, 0), 30);
    EXPECT_EQ(at_packed(table, 1), 20);
    EXPECT_EQ(at_packed(table, 2), -1);
    EXPECT_EQ(at_fixed(table, 0), -1);
    EXPECT_EQ(at_fixed(table, 1), 20);
    EXPECT_EQ(at_fixed(table, 2), 30);
}

TEST(a_new_row, reuses_the_lowest_free_fixed_index)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", columns(), explicit_write);
    for (kt_uint32_t id = 0; id < 6; ++id)
        add(table, id);
    commit(table);
    for (const kt_uint32_t packed : {4u, 1u})
        ASSERT_EQ(rg_delete_row_by_index_1(table, packed), 0);
    commit(table);
    add(table, 100);
    add(table, 101);
    add(table, 102);
    EXPECT_EQ(fixed_index_of(table, 100), 1u);
    EXPECT_EQ(fixed_index_of(table, 101), 4u);
    EXPECT_EQ(fixed_index_of(table, 102), 6u);
}

TEST(a_key_deleted_and_added_again, leaves_one_change_on_the_rows_list_and_an_updated_row)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", checked_columns(), explicit_write);
    for (kt_uint32_t id = 0; id < 3; ++id)
        add(table, id);
    commit(table);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(listed(&object(table), 1), std::vector<kt_uint32_t>{1});
    EXPECT_EQ(state_of(table, 1), +RG_ROW_STATE_DELETED);

    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", int64(11)}}), 0);
    EXPECT_EQ(listed(&object(table), 0), std::vector<kt_uint32_t>{1});
    EXPECT_EQ(listed(&object(table), 1), std::vector<kt_uint32_t>{});
    EXPECT_EQ(state_of(table, 1), +RG_ROW_STATE_UPDATED);
    EXPECT_EQ(object(table).applied_deletions, 0u);
    EXPECT_EQ(at_fixed(table, 1), 11);
    commit(table);
    EXPECT_EQ(at_packed(table, 1), 11);
    EXPECT_EQ(object(table).total_committed_rows, 3u);
}

TEST(a_row_added_and_deleted_before_commit, leaves_no_trace_after_commit_and_none_after_abort)
{
    for (const bool hashed : {false, true})
        for (const bool aborts : {false, true}) {
            open_tree                tree;
            const rg_opaque_handle_t table = hashed ? create_hashed_table(tree, "t", checked_columns(), explicit_write)
                                                    : create_table(tree, "t", checked_columns(), explicit_write);
            add(table, 1);
            commit(table);
            const kt_uint32_t used_bytes = object(table).record_buffer_pool.used_bytes;

            add(table, 2);
            ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
            EXPECT_EQ(state_of(table, 1), +RG_ROW_STATE_NO_ROW);
            EXPECT_EQ(object(table).total_applied_rows, 2u) << "it holds its place until commit or abort";
            if (aborts)
                ASSERT_EQ(rg_abort_1(table), 0);
            else
                commit(table);
            EXPECT_EQ(object(table).total_applied_rows, 1u);
            EXPECT_EQ(object(table).record_buffer_pool.used_bytes, used_bytes);
            EXPECT_EQ(free_slots(&object(table)).front(), 1u);
            EXPECT_EQ(listed(&object(table), 0), std::vector<kt_uint32_t>{});
            EXPECT_EQ(listed(&object(table), 1), std::vector<kt_uint32_t>{});
            kt_uint32_t index = 0;
            EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, uint32(2), &index), RG_E_NO_SUCH_KEY);
            add(table, 2);
            EXPECT_EQ(fixed_index_of(table, 2), 1u);
        }
}

TEST(growing_while_adding, without_memory_refuses_the_row_and_keeps_the_table_usable)
{
    open_tree                tree;
    const rg_opaque_handle_t table = create_hashed_table(tree, "t", checked_columns(), explicit_write);
    for (kt_uint32_t id = 0; id < 100; ++id)
        add(table, id);
    for (unsigned nth = 1; nth <= 2; ++nth) {
        fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(add_row(table, {{"id", uint32(100)}}), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(object(table).maximum_rows, 100u);
        EXPECT_EQ(object(table).total_applied_rows, 100u);
    }
    add(table, 100);
    for (kt_uint32_t id = 0; id <= 100; ++id)
        EXPECT_EQ(at_fixed(table, fixed_index_of(table, id)), id * 10);
}
