// SPDX-License-Identifier: MIT
// Abort: the last committed state again, in memory always, in the file as far as its length goes.
#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicitly = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

struct aborting : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    static inline const file_state before{0, 4, {{1, 1}, {2, 2}, {3, 3}}};

    rg_opaque_handle_t opened_with_rows()
    {
        rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        return r.open(explicitly);
    }
    static void change(rg_opaque_handle_t table)
    {
        EXPECT_EQ(add(table, 4, 40), 0);
        EXPECT_EQ(set(table, 1, 10), 0);
        EXPECT_EQ(remove(table, 2), 0);
        EXPECT_EQ(set(table, 3, 30), 0); // updated and then deleted
        EXPECT_EQ(remove(table, 3), 0);
        EXPECT_EQ(add(table, 5, 50), 0); // added and then deleted
        EXPECT_EQ(remove(table, 5), 0);
    }
    // Memory is as the last commit left it, and the free slots are used again from the lowest on.
    static void expect_memory_restored(rg_opaque_handle_t table)
    {
        const rg_i_table_t & t = object(table);
        EXPECT_EQ(rows_of(table), (rows{{1, 1}, {2, 2}, {3, 3}}));
        EXPECT_EQ(t.ready_for_commit, 0u);
        EXPECT_EQ(t.applied_deletions, 0u);
        EXPECT_EQ(t.total_applied_rows, 3u);
        EXPECT_EQ(t.total_committed_rows, 3u);
        EXPECT_EQ(t.p_rows_change_list, nullptr);
        EXPECT_EQ(t.p_delete_rows_change_list, nullptr);
        EXPECT_EQ(t.p_rows_free_chain, t.p_rows_fixed_index + 3);
        for (int slot = 0; slot < 3; ++slot) {
            const rg_i_index_entry_t & entry = t.p_rows_fixed_index[slot];
            EXPECT_EQ(+entry.p_applied, +entry.p_committed);
            EXPECT_EQ(+entry.applied_file_offset, 0u);
            EXPECT_EQ(+entry.p_pending_change, nullptr);
        }
    }
};

} // namespace

TEST_F(aborting, nothing_is_no_op_and_returns_0)
{
    rg_opaque_handle_t table   = opened_with_rows();
    const bytes        content = read_file(r.path);
    reset_calls();
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(calls_made(call::ftruncate) + calls_made(call::fsync) + calls_made(call::unlink), 0u);
    EXPECT_EQ(read_file(r.path), content);
    expect_memory_restored(table);
}

TEST_F(aborting, what_is_pending_touches_no_file)
{
    rg_opaque_handle_t table   = opened_with_rows();
    const bytes        content = read_file(r.path);
    const kt_uint32_t  used    = object(table).record_buffer_pool.used_bytes;
    change(table);
    reset_calls();
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(calls_made(call::ftruncate) + calls_made(call::fsync) + calls_made(call::unlink), 0u);
    EXPECT_EQ(read_file(r.path), content);
    expect_memory_restored(table);
    EXPECT_EQ(object(table).record_buffer_pool.used_bytes, used) << "every pending record is free again";
}

TEST_F(aborting, an_applied_table_opened_and_not_committed_since_loses_nothing)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    const rg_i_table_t & t      = object(table);
    const bytes          whole  = read_file(r.path);
    const kt_uint32_t    length = t.commit_record_offset + t.commit_record_length;
    EXPECT_GT(length, t.disk_commit_record_offset + t.disk_commit_record_length)
        << "the memory image's figures, which are larger than the file's";
    reset_calls();
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(calls_made(call::ftruncate), 1u);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_EQ(read_file(r.path).size(), length);
    expect_memory_restored(table);
    EXPECT_EQ(state_in(r.dir.path()), before);
    EXPECT_EQ(add(table, 9, 9), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 5, {{1, 1}, {2, 2}, {3, 3}, {9, 9}}}));
}

TEST_F(aborting, may_extend_the_file_with_zeros_which_are_dead_bytes)
{
    rg_opaque_handle_t table = opened_with_rows();
    EXPECT_EQ(rg_apply_1(table, 0), 0); // a commit record alone, shorter than what the image's figures are ahead
    const size_t applied_length = read_file(r.path).size();
    EXPECT_EQ(rg_abort_1(table), 0);
    const bytes content = read_file(r.path);
    EXPECT_GT(content.size(), applied_length);
    EXPECT_EQ(content.back(), 0);
    EXPECT_EQ(state_in(r.dir.path()), before);
}

TEST_F(aborting, an_applied_table_with_commits_since_the_open_cuts_to_the_length_of_the_open)
{
    rg_opaque_handle_t   table  = opened_with_rows();
    const rg_i_table_t & t      = object(table);
    const kt_uint32_t    length = t.commit_record_offset + t.commit_record_length;
    for (std::uint32_t id = 100; id < 120; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(add(table, 4, 40), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(read_file(r.path).size(), length) << "inside data committed since";
    EXPECT_EQ(t.commit_record_offset + t.commit_record_length, length);
    EXPECT_EQ(state_in(r.dir.path()).rc, RG_E_NO_COMMIT_RECORD);
    EXPECT_EQ(t.total_applied_rows, 23u) << "memory has all of it";
    // The way back to a whole file is a rewrite.
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).rows.size(), 23u);
}

TEST_F(aborting, an_applied_table_in_the_process_that_created_it_empties_the_file)
{
    rg_opaque_handle_t table = r.create(explicitly);
    EXPECT_EQ(add(table, 1, 1), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_TRUE(read_file(r.path).empty());
    EXPECT_EQ(state_in(r.dir.path()).rc, RG_E_TABLE_UNREADABLE);
}

TEST_F(aborting, and_committing_again_behind_an_emptied_file_leaves_one_that_answers_14)
{
    rg_opaque_handle_t table = r.create(explicitly);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(add(table, 2, 2), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object(table).disk_applied_commit_record_offset, 115u + 32) << "no figure follows the new length";
    EXPECT_EQ(rg_commit_1(table), 0);
    const bytes content = read_file(r.path);
    EXPECT_EQ(content.size(), 171u);
    EXPECT_EQ(content[0], 0);
    EXPECT_EQ(state_in(r.dir.path()).rc, RG_E_TABLE_UNREADABLE);
}

TEST_F(aborting, a_rewrite_removes_its_file_and_leaves_the_table_file_alone)
{
    rg_opaque_handle_t table       = opened_with_rows();
    const bytes        content     = read_file(r.path);
    const size_t       descriptors = open_descriptors();
    change(table);
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    EXPECT_TRUE(file_exists(r.rewrite));
    reset_calls();
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(calls_made(call::ftruncate) + calls_made(call::fsync), 0u);
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(read_file(r.path), content);
    EXPECT_EQ(object(table).rewrite_file_fd, -1);
    EXPECT_EQ(object(table).rewrite_file_length, 0u);
    EXPECT_EQ(open_descriptors(), descriptors);
    EXPECT_EQ(rows_of(table), (rows{{1, 1}, {2, 2}, {3, 3}}));
}

TEST_F(aborting, a_rewrite_leaves_stamps_that_make_a_later_deletion_name_a_wrong_place)
{
    rg_opaque_handle_t table = opened_with_rows();
    // The rewrite moves rows 2 and 3: in the new file each stands 24 and 48 bytes ahead.
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    EXPECT_EQ(rg_abort_1(table), 0);
    const rg_i_index_entry_t & third = object(table).p_rows_fixed_index[2];
    EXPECT_EQ(+third.file_offset, 227u);
    EXPECT_EQ(+rg_i_record_head(third.p_committed)->disk_table_offset, 91u + 2 * 32);
    EXPECT_NE(+third.applied_file_offset, 0u);

    // An update is right, since it takes the slot's offset.
    EXPECT_EQ(set(table, 2, 22), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 5, {{1, 1}, {2, 22}, {3, 3}}}));
    // A deletion takes the record's stamp, which names nothing in this file.
    EXPECT_EQ(remove(table, 3), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).rc, RG_E_BAD_DELETED_ROW_OFFSET);
}

TEST_F(aborting, a_transient_table_has_no_file_effect)
{
    rg_opaque_handle_t table = create_table(r.tree, "/transient", example_columns(), explicitly);
    for (std::uint32_t id = 1; id <= 3; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    change(table);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    reset_calls();
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(calls_made(call::ftruncate) + calls_made(call::fsync) + calls_made(call::unlink), 0u);
    expect_memory_restored(table);
}

TEST_F(aborting, takes_new_keys_out_of_the_hash_table_and_keeps_the_others)
{
    rg_opaque_handle_t table = create_hashed_table(r.tree, "/r/t", example_columns(), explicitly);
    for (std::uint32_t id = 1; id <= 3; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(rg_i_apply(&object(table), 0, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    change(table);
    EXPECT_EQ(rg_abort_1(table), 0);
    kt_uint32_t fixed = 0;
    for (std::uint32_t id = 1; id <= 3; ++id) {
        EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, uint32(id), &fixed), 0) << id;
        EXPECT_EQ(fixed, id - 1);
    }
    for (std::uint32_t id = 4; id <= 5; ++id) {
        EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, uint32(id), &fixed), RG_E_NO_SUCH_KEY);
        EXPECT_EQ(add(table, id, id), 0);
    }
}

TEST_F(aborting, throws_the_applications_pending_data_away)
{
    rg_opaque_handle_t table = opened_with_rows();
    struct {
        kt_uint32_t length  = 3;
        char        data[8] = "abc";
    } blob;
    EXPECT_EQ(rg_set_application_metadata_1(table, reinterpret_cast<kt_binary_t *>(&blob)), 0);
    EXPECT_EQ(object(table).p_application_metadata->total_elements, 1u);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(object(table).p_application_metadata->total_elements, 0u);
}

TEST_F(aborting, is_not_failed_by_the_disk)
{
    for (const call which : {call::ftruncate, call::fsync}) {
        for (const int the_errno : {EIO, ENOSPC, EROFS}) {
            registry_at        other;
            rg_opaque_handle_t table = other.create(explicitly);
            EXPECT_EQ(add(table, 1, 1), 0);
            EXPECT_EQ(rg_apply_1(table, 0), 0);
            fail_call(which, 1, the_errno);
            EXPECT_EQ(rg_abort_1(table), 0);
            EXPECT_TRUE(failed_as_asked(which));
            EXPECT_EQ(object(table).ready_for_commit, 0u);
            EXPECT_EQ(object(table).total_applied_rows, 0u);
            EXPECT_EQ(error_code(), 0);
        }
    }
    rg_opaque_handle_t table = opened_with_rows();
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    fail_call(call::unlink, 1, EROFS);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_TRUE(file_exists(r.rewrite));
    EXPECT_EQ(state_in(r.dir.path()), before);
}

TEST_F(aborting, leaves_lines_that_tell_the_places_apart)
{
    rg_opaque_handle_t table = opened_with_rows();
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    trace_lines lines;
    EXPECT_EQ(rg_abort_1(table), 0);
    const auto left = lines.with("DV|ABT|");
    ASSERT_EQ(left.size(), 3u) << "at the start, ahead of the cut, and at the end";
    EXPECT_NE(trace_lines::field(left[0], 2), trace_lines::field(left[1], 2));
    EXPECT_NE(trace_lines::field(left[1], 2), trace_lines::field(left[2], 2));
    EXPECT_EQ(trace_lines::field(left[1], 4), "1");
    EXPECT_EQ(trace_lines::field(left[2], 4), "0");
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(lines.with("DV|ABT|").size(), 5u);
}
