// SPDX-License-Identifier: MIT
// Deleting rows: by packed index, all of them, and those that match criteria.
#include <algorithm>

#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

constexpr rg_row_state_t deleted = RG_ROW_STATE_DELETED;
constexpr rg_row_state_t no_row  = RG_ROW_STATE_NO_ROW;

struct deleting_rows : on_each_kind_of_table {
    rg_opaque_handle_t make_numbered(kt_uint32_t rows, kt_int32_t mode = explicit_writing)
    {
        const rg_opaque_handle_t table =
            make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("n", KT_INT32), column("s", KT_CHAR_PTR)}, mode);
        for (kt_uint32_t row = 0; row < rows; ++row)
            EXPECT_EQ(add_row(table, {{"id", uint32(row)},
                                      {"n", int32(static_cast<std::int32_t>(row) % 3)},
                                      {"s", string(row % 2 == 0 ? "even" : "odd")}}),
                      0);
        return table;
    }
    // The ids of the rows that have an applied record.
    static std::vector<kt_uint32_t> live_ids(rg_opaque_handle_t table)
    {
        std::vector<kt_uint32_t> ids;
        for (kt_uint32_t packed = 0; packed < object_of(table).total_applied_rows; ++packed)
            if (const reading r = read_packed(table, packed, "id", 1); r.rc == 0)
                ids.push_back(r.value.val_uint32);
        return ids;
    }
};
ON_EACH_KIND_OF_TABLE(deleting_rows);

using ids = std::vector<kt_uint32_t>;

TEST_P(deleting_rows, by_index_marks_a_committed_row_and_keeps_its_record)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    const kt_uint32_t taken = picture_of(table).taken_bytes;
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(error_code(), 0);
    const table_picture picture = picture_of(table);
    EXPECT_EQ(state_of(table, 1), deleted);
    EXPECT_EQ(picture.deleted, ids{1});
    EXPECT_EQ(picture.applied_deletions, 1u);
    EXPECT_EQ(picture.applied_rows, 3u) << "counted until the commit";
    EXPECT_EQ(picture.packed_index, (ids{0, 1, 2}));
    EXPECT_EQ(picture.taken_bytes, taken);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(picture_of(table).packed_index, (ids{0, 2})) << "the last one moved into the hole";
    EXPECT_LT(picture_of(table).taken_bytes, taken);
    EXPECT_EQ(object_of(table).applied_deletions, 0u);
    EXPECT_EQ(find_key(table, uint32(1)), -RG_E_NO_SUCH_KEY);
    EXPECT_EQ(find_key(table, uint32(2)), 2) << "fixed indices stay";
}

TEST_P(deleting_rows, of_packed_index_0_makes_the_last_one_the_new_0)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_packed(table, 0, "id").value.val_uint32, 2u);
    EXPECT_EQ(read_packed(table, 1, "id").value.val_uint32, 1u);
    EXPECT_EQ(read_packed(table, 2, "id").rc, RG_E_NO_SUCH_INDEX);
}

TEST_P(deleting_rows, one_after_the_other_shifts_no_position)
{
    const rg_opaque_handle_t table = make_numbered(5);
    ASSERT_EQ(commit(table), 0);
    for (kt_uint32_t packed = 0; packed < 5; ++packed)
        ASSERT_EQ(rg_delete_row_by_index_1(table, packed), 0) << packed;
    EXPECT_EQ(live_ids(table), ids{});
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
}

TEST_P(deleting_rows, gives_the_record_of_an_updated_row_back)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    const kt_uint32_t taken = picture_of(table).taken_bytes;
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"s", string("a new text")}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(picture_of(table).taken_bytes, taken);
    EXPECT_EQ(picture_of(table).deleted, ids{0});
    EXPECT_TRUE(picture_of(table).updated.empty()) << "moved from one list to the other";
    EXPECT_EQ(taken_string(read_fixed(table, 0, "s")), "even");
}

TEST_P(deleting_rows, that_were_added_in_the_transaction_leaves_no_row_and_a_taken_slot)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(add_row(table, {{"id", uint32(9)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(state_of(table, 1), no_row);
    EXPECT_EQ(picture_of(table).taken_bytes, before.taken_bytes) << "its record is back in the pool";
    EXPECT_EQ(picture_of(table).packed_index, (ids{0, 1})) << "its slot stays taken";
    EXPECT_EQ(picture_of(table).deleted, ids{1});
    ASSERT_EQ(commit(table), 0);
    const table_picture after = picture_of(table);
    EXPECT_EQ(after.slots, before.slots);
    EXPECT_EQ(after.hashed, before.hashed);
    EXPECT_EQ(after.committed_rows, 1u);
}

TEST_P(deleting_rows, twice_is_refused_and_changes_nothing)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(9)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 2), 0);
    const table_picture before = picture_of(table);
    for (const kt_uint32_t packed : {1u, 2u}) {
        EXPECT_EQ(rg_delete_row_by_index_1(table, packed), RG_E_ROW_DELETED);
        EXPECT_EQ(error_code(), RG_E_ROW_DELETED);
    }
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(deleting_rows, by_an_index_out_of_range_is_refused)
{
    const rg_opaque_handle_t table = make_numbered(2);
    for (const kt_uint32_t packed : {2u, 99u, 100u, 0x80000000u, 0xFFFFFFFFu}) {
        EXPECT_EQ(rg_delete_row_by_index_1(table, packed), RG_E_NO_SUCH_INDEX);
        EXPECT_EQ(error_message_index(), 20);
    }
    EXPECT_EQ(rg_delete_row_by_index_1(nullptr, 0), RG_E_INVALID_HANDLE);
}

TEST_P(deleting_rows, by_index_goes_through_between_apply_and_commit_and_in_bulk_does_not)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_delete_rows_1(table, nullptr), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(error_message_index(), 29);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(state_of(table, 1), no_row);
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(live_ids(table), (ids{0, 2})) << "gone in memory";
    picture_of(table);
}

TEST_P(deleting_rows, with_no_criteria_deletes_every_live_row)
{
    const rg_opaque_handle_t table = make_numbered(10);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 4), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(50)}}), 0);
    ASSERT_EQ(rg_delete_rows_1(table, nullptr), 0);
    EXPECT_EQ(live_ids(table), ids{});
    EXPECT_EQ(object_of(table).applied_deletions, 11u);
    EXPECT_EQ(rg_delete_rows_1(table, nullptr), RG_E_NO_ROWS_TO_DELETE) << "all are deleted in this transaction";
    EXPECT_EQ(error_message_index(), 22);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
    EXPECT_EQ(rg_delete_rows_1(table, nullptr), RG_E_NO_ROWS_TO_DELETE) << "an empty table";
    EXPECT_EQ(rg_delete_rows_1(table, text("nothing like an expression")), RG_E_NO_ROWS_TO_DELETE)
        << "told ahead of what is wrong with the criteria";
}

TEST_P(deleting_rows, by_criteria_deletes_those_that_match)
{
    const rg_opaque_handle_t table = make_numbered(10);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_rows_1(table, text("n == $i && s == $s"), 0, "even"), 0);
    EXPECT_EQ(live_ids(table), (ids{1, 2, 3, 4, 5, 7, 8, 9}));
    ASSERT_EQ(rg_delete_rows_1(table, text("id > $ui"), 6u), 0);
    EXPECT_EQ(live_ids(table), (ids{1, 2, 3, 4, 5}));
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(live_ids(table).size(), 10u);
}

TEST_P(deleting_rows, judges_rows_by_their_applied_state)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"n", int32(100)}}), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(9)}, {"n", int32(100)}}), 0);
    ASSERT_EQ(rg_delete_rows_1(table, text("n == 100")), 0);
    EXPECT_EQ(live_ids(table), (ids{0, 2}));
}

TEST_P(deleting_rows, deletes_exactly_those_that_match_however_many_there_are)
{
    constexpr kt_uint32_t    rows  = 330;
    const rg_opaque_handle_t table = make_numbered(rows);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_rows_1(table, text("id in (0, 63, 64, 127, 128, 329, 1000, -1, 65.0, 66.5)")), 0);
    ASSERT_EQ(rg_delete_rows_1(table, text("id >= 130 && id < 260 && n != 1")), 0);
    ids expected;
    for (kt_uint32_t id = 0; id < rows; ++id)
        if (id != 0 && id != 63 && id != 64 && id != 65 && id != 127 && id != 128 && id != 329 &&
            (id < 130 || id >= 260 || id % 3 == 1))
            expected.push_back(id);
    EXPECT_EQ(live_ids(table), expected);
    ASSERT_EQ(commit(table), 0);
    ids left = live_ids(table);
    std::sort(left.begin(), left.end());
    EXPECT_EQ(left, expected);
    ASSERT_EQ(rg_delete_rows_1(table, nullptr), 0);
    EXPECT_EQ(live_ids(table), ids{});
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
}

TEST_P(deleting_rows, that_no_criteria_match_is_a_success_without_a_change)
{
    const rg_opaque_handle_t table  = make_numbered(3);
    const table_picture      before = picture_of(table);
    EXPECT_EQ(rg_delete_rows_1(table, text("n > 1000")), 0);
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(deleting_rows, passes_over_rows_whose_evaluation_faults)
{
    const rg_opaque_handle_t table = make_numbered(6); // n is 0 1 2 0 1 2
    ASSERT_EQ(rg_delete_rows_1(table, text("6 / n == 3")), 0) << "a division by zero in the first row";
    EXPECT_EQ(live_ids(table), (ids{0, 1, 3, 4}));
    const rg_opaque_handle_t arrays = registry_of_tables::make(
        GetParam(), {column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_INT32_ARRAY)}, explicit_writing, "arrays");
    kt_array_t array{1, 0, {int32(7)}};
    kt_value_t value{};
    value.ptr_array = &array;
    ASSERT_EQ(add_row(arrays, {{"id", uint32(0)}}), 0);
    ASSERT_EQ(add_row(arrays, {{"id", uint32(1)}, {"a", value}}), 0);
    ASSERT_EQ(rg_delete_rows_1(arrays, text("a[0] == 7")), 0) << "no such element in the first row";
    EXPECT_EQ(live_ids(arrays), (ids{0}));
    // A row whose string leads outside it.
    const kt_pmsg_value_anchor_t bent{0, 0xFFFFFFFF};
    std::memcpy(rg_i_row_slot(slot_of(table, 1).p_applied, 2), &bent, sizeof bent);
    ASSERT_EQ(rg_delete_rows_1(table, text("s != \"\"")), 0);
    EXPECT_EQ(live_ids(table), (ids{1}));
}

TEST_P(deleting_rows, by_wrong_criteria_is_refused)
{
    const rg_opaque_handle_t table  = make_numbered(3);
    const table_picture      before = picture_of(table);
    EXPECT_EQ(rg_delete_rows_1(table, text("n ==")), RG_E_LIBRARY_CALL);
    EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("ku_comp_expr"), std::string::npos);
    EXPECT_EQ(rg_delete_rows_1(table, text("nothing == 1")), RG_E_LIBRARY_CALL);
    EXPECT_EQ(rg_delete_rows_1(table, text("")), RG_E_LIBRARY_CALL);
    EXPECT_EQ(rg_delete_rows_1(table, text("n == $x")), RG_E_INVALID_VARIABLE_TYPE);
    EXPECT_EQ(error_message_index(), 16);
    EXPECT_NE(error_text().find("n == $x"), std::string::npos);
    EXPECT_EQ(rg_delete_rows_1(nullptr, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(deleting_rows, on_an_implicitly_controlled_table_commits_them)
{
    const rg_opaque_handle_t table = make_numbered(10, implicit_writing);
    ASSERT_EQ(rg_delete_rows_1(table, text("s == \"odd\"")), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 5u);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 4u);
    ASSERT_EQ(rg_delete_rows_1(table, nullptr), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
}

TEST_P(deleting_rows, that_runs_out_of_memory_keeps_those_deleted_so_far)
{
    const rg_opaque_handle_t table = make_numbered(100);
    ASSERT_EQ(commit(table), 0);
    {
        const fault_scope faults;
        fail_call(call::allocation, 3, ENOMEM); // change entries come many at a time
        EXPECT_EQ(rg_delete_rows_1(table, nullptr), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    }
    const kt_uint32_t deleted = object_of(table).applied_deletions;
    EXPECT_GT(deleted, 0u);
    ids expected;
    for (kt_uint32_t id = deleted; id < 100; ++id)
        expected.push_back(id);
    EXPECT_EQ(live_ids(table), expected);
    EXPECT_LT(deleted, 100u);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(live_ids(table).size(), 100u);
}

TEST_P(deleting_rows, by_criteria_fails_cleanly_at_each_allocation)
{
    const rg_opaque_handle_t table    = make_numbered(3);
    kt_char_ptr_t            criteria = text("s like $s and n in (0, 1, 2, 3)");
    ASSERT_EQ(commit(table), 0);
    for (unsigned nth = 1;; ++nth) {
        ASSERT_EQ(rg_abort_1(table), 0);
        kt_int32_t rc     = 0;
        bool       failed = false;
        {
            const fault_scope faults;
            fail_call(call::allocation, nth, ENOMEM);
            rc     = rg_delete_rows_1(table, criteria, "ev%");
            failed = failed_as_asked(call::allocation);
        }
        if (!failed) {
            EXPECT_EQ(rc, 0);
            EXPECT_GT(nth, 3u);
            break;
        }
        EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL) << nth << " gave " << rc;
        EXPECT_EQ(error_code(), rc);
    }
    EXPECT_EQ(live_ids(table), ids{1});
}

TEST_P(deleting_rows, fills_the_holes_again_from_the_lowest)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK)});
    for (kt_uint32_t id = 0; id < 20; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_rows_1(table, text("id in (3, 17, 8)")), 0);
    ASSERT_EQ(commit(table), 0);
    for (kt_uint32_t id : {100u, 101u, 102u, 103u})
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    EXPECT_EQ(find_key(table, uint32(100)), 3);
    EXPECT_EQ(find_key(table, uint32(101)), 8);
    EXPECT_EQ(find_key(table, uint32(102)), 17);
    EXPECT_EQ(find_key(table, uint32(103)), 20);
}

struct a_table_without_a_tree : ::testing::Test, registry_of_tables {
};

TEST_F(a_table_without_a_tree, can_lose_all_its_rows_and_takes_no_criteria)
{
    const rg_opaque_handle_t table = make({false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    rg_i_tree_t * const p_tree = std::exchange(object_of(table).p_tree, nullptr);
    EXPECT_EQ(rg_delete_rows_1(table, text("id == 1")), RG_E_INTERNAL);
    EXPECT_EQ(error_code(), RG_E_INTERNAL);
    EXPECT_NE(error_text().find("rg_i_compile_expression"), std::string::npos);
    EXPECT_EQ(rg_delete_rows_1(table, nullptr), 0);
    object_of(table).p_tree = p_tree;
}

TEST_F(a_table_without_a_tree, stores_and_reads_strings_as_they_are)
{
    const rg_opaque_handle_t table  = make({false, false}, {column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    rg_i_tree_t * const      p_tree = std::exchange(object_of(table).p_tree, nullptr);
    ASSERT_EQ(add_row(table, {{"s", string("\xff\xfe")}}), 0) << "no handle, no conversion";
    EXPECT_EQ(taken_string(read_packed(table, 0, "s", 1)), "\xff\xfe");
    object_of(table).p_tree = p_tree;
}

} // namespace

} // namespace kt_test
