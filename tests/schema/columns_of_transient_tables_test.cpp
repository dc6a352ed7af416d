// SPDX-License-Identifier: MIT
// What a rebuild leaves of a table in memory: rows that no commit has.
#include "schema/columns_kit.h"

namespace kt_test
{

namespace
{

struct rebuilding_in_memory : testing::TestWithParam<bool>, registry_of_tables {
    rg_opaque_handle_t filled()
    {
        const rg_opaque_handle_t table = make({GetParam(), false}, three_columns());
        add_rows(table, three_rows());
        EXPECT_EQ(commit(table), 0);
        return table;
    }
};
INSTANTIATE_TEST_SUITE_P(tables, rebuilding_in_memory, testing::Bool(),
                         [](const auto & info) { return std::string(info.param ? "hashed" : "unhashed"); });

std::vector<column_change> rebuilds()
{
    std::vector<column_change> changes;
    for (const column_change & change : all_changes())
        if (!is_deletion(change))
            changes.push_back(change);
    return changes;
}

} // namespace

TEST_P(rebuilding_in_memory, leaves_the_rows_uncommitted_with_nothing_pending)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    const rg_i_table_t & object = object_of(table);
    EXPECT_EQ(object.total_applied_rows, 3u);
    EXPECT_EQ(object.total_committed_rows, 0u);
    EXPECT_EQ(object.p_rows_change_list, nullptr);
    for (kt_uint32_t slot = 0; slot < 3; ++slot) {
        EXPECT_EQ(state_of(table, slot), rg_row_state_t{RG_ROW_STATE_ADDED});
        EXPECT_EQ(+slot_of(table, slot).p_pending_change, nullptr);
        EXPECT_EQ(read_fixed(table, slot, "id").rc, RG_E_ROW_DELETED);
        EXPECT_EQ(read_fixed(table, slot, "id", 1).rc, 0);
    }
    EXPECT_EQ(description(table, 0)->number_of_rows, 0u);
    EXPECT_EQ(rg_commit_1(table), 0) << "nothing to commit";
    EXPECT_EQ(commit(table), 0) << "nor to apply";
    EXPECT_EQ(read_fixed(table, 0, "id").rc, RG_E_ROW_DELETED);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(rows_in(table, 1), three_rows());
}

TEST_P(rebuilding_in_memory, shows_the_rows_where_the_table_shows_uncommitted_updates)
{
    setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "", 1);
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    EXPECT_EQ(rows_in(table), three_rows());
    ASSERT_EQ(rename_column(table, "extra", "other"), 0) << "so that a second one sees them too";
    ASSERT_EQ(delete_columns(table, {"other"}), 0);
    unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE");
    EXPECT_EQ(rows_in(table), three_rows());
    EXPECT_EQ(object_of(table).total_committed_rows, 3u) << "a selection commits what it saw";
}

TEST_P(rebuilding_in_memory, a_second_time_sees_no_committed_rows_and_is_refused)
{
    for (const column_change & change : rebuilds()) {
        SCOPED_TRACE(change.name);
        registry_of_tables       other;
        const rg_opaque_handle_t table = other.make({GetParam(), false}, three_columns());
        add_rows(table, three_rows());
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(add_columns(table, {}), 0);
        const table_picture before  = picture_of(table);
        const kt_uint64_t   counter = object_of(table).change_counter;
        expect_failure_without_record(RG_E_ROW_DELETED, change.make(table));
        EXPECT_EQ(picture_of(table), before);
        EXPECT_EQ(object_of(table).change_counter, counter);
        EXPECT_EQ(rows_in(table, 1), three_rows());
    }
}

TEST_P(rebuilding_in_memory, and_deleting_columns_then_leaves_no_row)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    ASSERT_EQ(delete_columns(table, {"extra"}), 0);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
    EXPECT_TRUE(rows_in(table, 1).empty());
    EXPECT_EQ(find_key(table, uint32(1)), -RG_E_NO_SUCH_KEY);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
}

TEST_P(rebuilding_in_memory, an_update_and_a_commit_bring_a_row_back)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    ASSERT_EQ(set_fields_by_key(table, uint32(2), {{"val", int64(21)}}), 0);
    ASSERT_EQ(commit(table), 0);
    named_rows expected = three_rows();
    EXPECT_EQ(rows_in(table), (named_rows{{2, {expected[2].first, 21}}}));
    on_each_table_of_three_rows::make_committed(table);
    expected[2].second = 21;
    EXPECT_EQ(rows_in(table), expected);
    EXPECT_EQ(rename_column(table, "extra", "other"), 0) << "and let the table be rebuilt again";
}

TEST_P(rebuilding_in_memory, leaves_rows_that_can_be_deleted_and_slots_that_can_be_used)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 2), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}}), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_key(table, uint32(3), "id", 1).rc, RG_E_NO_SUCH_KEY);
    EXPECT_EQ(read_key(table, uint32(4), "extra").rc, 0);
    EXPECT_EQ(read_key(table, uint32(1), "val", 1).value.val_int64, 10);
}

} // namespace kt_test
