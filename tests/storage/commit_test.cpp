// SPDX-License-Identifier: MIT
// Commit: the one act on the disk, what memory makes of it, and what its faults leave.
#include <pthread.h>

#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicitly = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

struct committing : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    static inline const file_state before{0, 4, {{1, 1}, {2, 2}, {3, 3}}};
    static inline const file_state after{0, 5, {{1, 10}, {3, 3}, {4, 40}}};

    static rg_opaque_handle_t opened_with_rows(registry_at & registry)
    {
        rg_opaque_handle_t table = registry.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        return registry.open(explicitly);
    }
    static void change(rg_opaque_handle_t table)
    {
        EXPECT_EQ(add(table, 4, 40), 0);
        EXPECT_EQ(set(table, 1, 10), 0);
        EXPECT_EQ(remove(table, 2), 0);
    }
    // Applied and not committed: 0 appended, 1 rewritten.
    static rg_opaque_handle_t applied(registry_at & registry, kt_uint32_t rewrite = 0)
    {
        rg_opaque_handle_t table = opened_with_rows(registry);
        change(table);
        EXPECT_EQ(rg_i_apply(&object(table), rewrite, 0), 0);
        reset_calls();
        return table;
    }
};
struct committing_a_rewrite : committing {
};
struct a_commit_that_fails : committing {
};

} // namespace

TEST_F(committing, overwrites_four_bytes_and_syncs_once)
{
    rg_opaque_handle_t table = applied(r);
    file_image         expected(read_file(r.path));
    expected.at(object(table).disk_commit_record_offset + 8, 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(calls_made(call::write), 1u);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_EQ(calls_made(call::writev) + calls_made(call::rename) + calls_made(call::ftruncate), 0u);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(expected.content())) << "the old record's body stays";
    EXPECT_EQ(state_in(r.dir.path()), after);
}

TEST_F(committing, brings_memory_into_line)
{
    rg_opaque_handle_t table          = applied(r);
    rg_i_table_t &     t              = object(table);
    const kt_uint32_t  memory_offset  = t.commit_record_offset;
    const kt_uint32_t  memory_length  = t.commit_record_length;
    const kt_uint32_t  applied_offset = t.disk_applied_commit_record_offset;
    const kt_uint32_t  used           = t.record_buffer_pool.used_bytes;
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(t.ready_for_commit, 0u);
    EXPECT_EQ(t.applied_deletions, 0u);
    EXPECT_EQ(t.p_rows_change_list, nullptr);
    EXPECT_EQ(t.p_delete_rows_change_list, nullptr);
    EXPECT_EQ(t.change_counter, 5u);
    EXPECT_EQ(t.total_committed_rows, 3u);
    EXPECT_EQ(t.total_applied_rows, 3u);
    EXPECT_EQ(t.disk_commit_record_offset, applied_offset);
    EXPECT_EQ(t.disk_commit_record_length, 24u);
    EXPECT_EQ(t.commit_record_offset, memory_offset) << "commit leaves the figures of the open alone";
    EXPECT_EQ(t.commit_record_length, memory_length);
    EXPECT_LT(t.record_buffer_pool.used_bytes, used) << "replaced and deleted versions are free again";
    for (kt_uint32_t i = 0; i < t.total_applied_rows; ++i) {
        const rg_i_index_entry_t & entry = t.p_rows_fixed_index[t.p_rows_packed_index[i]];
        EXPECT_EQ(+entry.p_applied, +entry.p_committed);
        EXPECT_EQ(+entry.file_offset, +rg_i_record_head(entry.p_committed)->disk_table_offset);
        EXPECT_EQ(+entry.applied_file_offset, 0u);
        EXPECT_EQ(+entry.p_pending_change, nullptr);
        EXPECT_EQ(+entry.packed_index, i);
    }
    EXPECT_EQ(rows_of(table), (rows{{1, 10}, {4, 40}, {3, 3}})) << "the last row moved into the hole";
}

TEST_F(committing, a_row_gives_it_an_offset_that_its_next_version_names)
{
    rg_opaque_handle_t table = r.create(explicitly);
    EXPECT_EQ(add(table, 1, 1), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(+object(table).p_rows_fixed_index[0].file_offset, 115u);
    EXPECT_EQ(set(table, 1, 2), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_i_load_u32(read_file(r.path).data() + 171 + 12), 115u);
    EXPECT_EQ(rg_commit_1(table), 0);
}

TEST_F(committing, with_nothing_pending_and_nothing_applied_does_nothing)
{
    rg_opaque_handle_t table   = opened_with_rows(r);
    const bytes        content = read_file(r.path);
    reset_calls();
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(calls_made(call::write) + calls_made(call::fsync), 0u);
    EXPECT_EQ(read_file(r.path), content);
    EXPECT_EQ(object(table).change_counter, 4u);
    rg_opaque_handle_t transient = create_table(r.tree, "/transient", example_columns(), explicitly);
    EXPECT_EQ(rg_commit_1(transient), 0);
}

TEST_F(committing, what_was_not_applied_gives_210)
{
    rg_opaque_handle_t table = opened_with_rows(r);
    EXPECT_EQ(add(table, 4, 4), 0);
    EXPECT_EQ(rg_commit_1(table), RG_E_UNAPPLIED_TABLE);
    EXPECT_EQ(error_code(), RG_E_UNAPPLIED_TABLE);
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(remove(table, 1), 0);
    EXPECT_EQ(rg_commit_1(table), RG_E_UNAPPLIED_TABLE);
}

TEST_F(committing, a_transient_table_works_in_memory_alone)
{
    rg_opaque_handle_t table = create_table(r.tree, "/transient", example_columns(), explicitly);
    for (std::uint32_t id = 1; id <= 3; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    change(table);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    reset_calls();
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(calls_made(call::write) + calls_made(call::fsync) + calls_made(call::lseek), 0u);
    EXPECT_EQ(rows_of(table), (rows{{1, 10}, {4, 40}, {3, 3}}));
    EXPECT_EQ(object(table).change_counter, 3u);
    EXPECT_EQ(+object(table).p_rows_fixed_index[0].file_offset, 0u);
}

TEST_F(committing, the_deletion_of_the_last_row_moves_it_onto_itself)
{
    rg_opaque_handle_t table = opened_with_rows(r);
    EXPECT_EQ(remove(table, 3), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(rows_of(table), (rows{{1, 1}, {2, 2}}));
    EXPECT_EQ(remove(table, 1), 0);
    EXPECT_EQ(remove(table, 2), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(object(table).total_applied_rows, 0u);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 6, {}}));
}

TEST_F(committing, repoints_the_hash_element_of_an_updated_row)
{
    for (const bool by_text : {false, true}) {
        registry_at        other;
        rg_opaque_handle_t table = create_hashed_table(
            other.tree, "/r/t",
            {column("key", by_text ? KT_CHAR_PTR : KT_UINT32, RG_PRIMARY_KEY), column("v", KT_INT64)}, explicitly);
        const kt_value_t key = by_text ? string("a key") : uint32(17);
        ASSERT_EQ(add_row(table, {{"key", key}, {"v", int64(1)}}), 0);
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        for (std::int64_t v = 2; v < 6; ++v) {
            kt_value_t value = int64(v);
            ASSERT_EQ(rg_set_field_by_key_1(table, key, text("v"), &value), 0);
            EXPECT_EQ(rg_apply_1(table, 0), 0);
            EXPECT_EQ(rg_commit_1(table), 0);
            const rg_i_index_entry_t & entry = object(table).p_rows_fixed_index[0];
            EXPECT_EQ(entry.p_hash_table_element->p_key_value, rg_i_row_key(&object(table), entry.p_committed));
            ASSERT_EQ(rg_get_field_by_key_1(table, key, text("v"), &value), 0);
            EXPECT_EQ(value.val_int64, v);
        }
        EXPECT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        kt_uint32_t fixed = 0;
        EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, key, &fixed), RG_E_NO_SUCH_KEY);
    }
}

TEST_F(committing, takes_the_applications_data_along)
{
    rg_opaque_handle_t table = opened_with_rows(r);
    struct {
        kt_uint32_t length  = 3;
        char        data[8] = "abc";
    } blob;
    EXPECT_EQ(rg_set_application_metadata_1(table, reinterpret_cast<kt_binary_t *>(&blob)), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object(table).disk_applied_commit_record_length, 24u + 4 + 8 + 3);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(object(table).disk_commit_record_length, 24u + 4 + 8 + 3);
    const rg_i_application_metadata_index_element_t & element = object(table).p_application_metadata->p_index[0];
    EXPECT_EQ(element.p_applied, element.p_committed);
    EXPECT_EQ(add(table, 9, 9), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).rows.size(), 4u) << "the group begins behind the longer commit record";
}

// ---- Faults ----

TEST_F(a_commit_that_fails, in_the_seek_gives_10_and_changes_nothing)
{
    rg_opaque_handle_t table   = applied(r);
    const bytes        content = read_file(r.path);
    fail_call(call::lseek, 1, EIO);
    EXPECT_EQ(rg_commit_1(table), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The lseek64 system call"), std::string::npos);
    EXPECT_EQ(read_file(r.path), content);
    EXPECT_EQ(object(table).ready_for_commit, 1u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), after);
}

TEST_F(a_commit_that_fails, in_the_overwrite_gives_its_code_and_undoes_nothing)
{
    for (const auto & [the_errno, code] : {std::pair{EIO, RG_E_SYSTEM_CALL}, {ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}}) {
        registry_at        other;
        rg_opaque_handle_t table = applied(other);
        fail_call(call::write, 1, the_errno);
        EXPECT_EQ(rg_commit_1(table), code);
        EXPECT_EQ(error_code(), code);
        EXPECT_EQ(calls_made(call::write), 1u);
        EXPECT_EQ(calls_made(call::fsync), 0u);
        EXPECT_EQ(object(table).ready_for_commit, 1u);
        EXPECT_EQ(state_in(other.dir.path()), before);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), after);
    }
}

TEST_F(a_commit_that_fails, in_the_sync_is_taken_back_and_returns_0)
{
    for (const int the_errno : {EIO, ENOSPC}) {
        registry_at        other;
        rg_opaque_handle_t table   = applied(other);
        const bytes        content = read_file(other.path);
        fail_call(call::fsync, 1, the_errno);
        EXPECT_EQ(rg_commit_1(table), 0) << "the code of the write that took it back";
        EXPECT_EQ(error_code(), 0);
        EXPECT_EQ(calls_made(call::write), 2u);
        EXPECT_EQ(calls_made(call::fsync), 2u);
        EXPECT_EQ(read_file(other.path), content) << "the type is back at 0xFFFFFFFF";
        EXPECT_EQ(object(table).ready_for_commit, 1u);
        EXPECT_EQ(object(table).change_counter, 4u);
        EXPECT_EQ(state_in(other.dir.path()), before);
        EXPECT_EQ(add(table, 5, 5), RG_E_APPLIED_UNCOMMITTED) << "which is how the caller sees it";
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(object(table).ready_for_commit, 0u);
        EXPECT_EQ(state_in(other.dir.path()), after);
    }
}

TEST_F(a_commit_that_fails, in_the_sync_has_shown_readers_the_new_state_before_it_is_taken_back)
{
    // Why the outcome of a failed sync is unknown: readers saw it, and the disk may have either.
    rg_opaque_handle_t table = applied(r);
    moment             sync;
    before_call(call::fsync, 1, [&] { sync.take(r); });
    fail_call(call::fsync, 1, EIO);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(sync.state(), after);
    EXPECT_EQ(state_in(r.dir.path()), before);
}

TEST_F(a_commit_that_fails, in_the_sync_and_in_the_second_sync_still_returns_0)
{
    rg_opaque_handle_t table = applied(r);
    fail_call(call::fsync, 1, EIO, 2);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(object(table).ready_for_commit, 1u);
}

TEST_F(a_commit_that_fails, in_the_sync_and_in_taking_it_back_gives_that_failures_code)
{
    struct fault {
        call       which;
        unsigned   nth;
        int        the_errno;
        kt_int32_t code;
    };
    for (const fault & f : {fault{call::lseek, 2, EIO, RG_E_SYSTEM_CALL},
                            {call::write, 2, EIO, RG_E_SYSTEM_CALL},
                            {call::write, 2, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}}) {
        registry_at        other;
        rg_opaque_handle_t table = applied(other);
        fail_call(call::fsync, 1, EIO);
        fail_call(f.which, f.nth, f.the_errno);
        EXPECT_EQ(rg_commit_1(table), f.code);
        EXPECT_EQ(error_code(), f.code);
        EXPECT_EQ(object(table).ready_for_commit, 1u);
        EXPECT_EQ(calls_made(call::fsync), 1u);
        EXPECT_EQ(state_in(other.dir.path()), after) << "the word stays as the failed sync left it";
    }
}

TEST_F(a_commit_that_fails, on_an_implicitly_controlled_table_is_not_aborted)
{
    rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
    reset_calls();
    fail_call(call::write, 1, EIO);
    EXPECT_EQ(add(table, 1, 1), RG_E_SYSTEM_CALL);
    EXPECT_EQ(object(table).ready_for_commit, 1u);
    EXPECT_EQ(add(table, 2, 2), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 2, {{1, 1}}}));
}

TEST_F(committing, an_implicit_update_whose_apply_fails_is_taken_back_with_the_code_of_the_apply)
{
    rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
    EXPECT_EQ(add(table, 1, 1), 0);
    fail_call(call::writev, 1, EIO);
    EXPECT_EQ(add(table, 2, 2), RG_E_SYSTEM_CALL);
    EXPECT_EQ(rows_of(table), (rows{{1, 1}}));
    EXPECT_EQ(add(table, 3, 3), 0);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 3, {{1, 1}, {3, 3}}}));
}

TEST_F(committing, leaves_a_line_at_the_start_and_at_the_end)
{
    rg_opaque_handle_t table = applied(r);
    trace_lines        lines;
    EXPECT_EQ(rg_commit_1(table), 0);
    const auto left = lines.with("DV|COM|");
    ASSERT_EQ(left.size(), 2u);
    EXPECT_NE(trace_lines::field(left[0], 2), trace_lines::field(left[1], 2));
    const rg_i_table_t & t = object(table);
    char                 expected[200];
    std::snprintf(expected, sizeof expected, "DV|COM|%s|%x|0|%u|0|%u|0|%d|-1", trace_lines::field(left[1], 2).c_str(),
                  static_cast<unsigned>(reinterpret_cast<uintptr_t>(&t)), t.commit_record_offset, t.file_length,
                  t.file_fd);
    EXPECT_EQ(left[1], expected);
}

TEST_F(a_commit_that_fails, leaves_lines_by_which_the_step_can_be_told)
{
    std::map<std::string, int> last_sites;
    const auto                 run = [&](auto plan, kt_uint32_t rewrite, size_t count) {
        registry_at        other;
        rg_opaque_handle_t table = applied(other, rewrite);
        trace_lines        lines;
        plan();
        (void)rg_commit_1(table);
        const auto left = lines.with("DV|COM|");
        ASSERT_EQ(left.size(), count);
        EXPECT_EQ(last_sites[trace_lines::field(left.back(), 2)]++, 0) << left.back();
        reset_calls();
    };
    run([] { fail_call(call::lseek, 1, EIO); }, 0, 2);
    run([] { fail_call(call::write, 1, EIO); }, 0, 2);
    const auto failed_sync = [](call which) {
        fail_call(call::fsync, 1, EIO);
        if (which != call::fsync)
            fail_call(which, 2, EIO);
    };
    run([&] { failed_sync(call::fsync); }, 0, 3);
    run([&] { failed_sync(call::lseek); }, 0, 3);
    run([&] { failed_sync(call::write); }, 0, 3);
    run([] { fail_call(call::allocation, 1, ENOMEM); }, 1, 2);
    for (const int the_errno : {EACCES, ENOSPC, EIO})
        run([=] { fail_call(call::rename, 1, the_errno); }, 1, 2);
    run([] {}, 0, 2);
}

// ---- Cancellation ----

namespace
{

struct cancelled_call {
    rg_opaque_handle_t table;
    pthread_t          thread;
    int                state_inside = -1;
    int                state_after  = -1;
    kt_int32_t         rc           = -1;
};

void * commit_while_cancelled(void * p)
{
    auto * p_call = static_cast<cancelled_call *>(p);
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, nullptr);
    // In the middle of the disk step somebody cancels the thread.
    before_call(call::write, 1, [=] {
        pthread_cancel(pthread_self());
        pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &p_call->state_inside);
    });
    p_call->rc = rg_commit_1(p_call->table);
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &p_call->state_after);
    return nullptr;
}

} // namespace

TEST_F(committing, disables_cancellation_and_restores_the_callers_state)
{
    cancelled_call call{applied(r), {}};
    ASSERT_EQ(pthread_create(&call.thread, nullptr, commit_while_cancelled, &call), 0);
    ASSERT_EQ(pthread_join(call.thread, nullptr), 0);
    EXPECT_EQ(call.rc, 0);
    EXPECT_EQ(call.state_inside, PTHREAD_CANCEL_DISABLE);
    EXPECT_EQ(call.state_after, PTHREAD_CANCEL_DISABLE) << "not simply enabled";
    EXPECT_EQ(state_in(r.dir.path()), after);

    rg_opaque_handle_t table = call.table;
    EXPECT_EQ(set(table, 3, 8), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    reset_calls();
    int inside = -1, state = -1;
    before_call(call::fsync, 1, [&] { pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &inside); });
    EXPECT_EQ(rg_commit_1(table), 0);
    pthread_setcancelstate(PTHREAD_CANCEL_ENABLE, &state);
    EXPECT_EQ(inside, PTHREAD_CANCEL_DISABLE);
    EXPECT_EQ(state, PTHREAD_CANCEL_ENABLE);
}

// ---- The rewritten file ----

TEST_F(committing_a_rewrite, renames_once_and_syncs_nothing)
{
    rg_opaque_handle_t table          = applied(r, 1);
    const kt_int32_t   rewrite_fd     = object(table).rewrite_file_fd;
    const kt_int32_t   former_fd      = object(table).file_fd;
    const kt_uint32_t  rewrite_length = object(table).rewrite_file_length;
    const size_t       descriptors    = open_descriptors();
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(calls_made(call::rename), 1u);
    EXPECT_EQ(calls_made(call::fsync) + calls_made(call::write), 0u);
    EXPECT_EQ(object(table).file_fd, rewrite_fd);
    EXPECT_EQ(object(table).rewrite_file_fd, -1);
    EXPECT_NE(former_fd, rewrite_fd);
    EXPECT_EQ(open_descriptors(), descriptors - 1);
    EXPECT_EQ(object(table).file_length, rewrite_length);
    EXPECT_EQ(object(table).rewrite_file_length, 0u);
    EXPECT_STREQ(object(table).p_file_path, r.path.c_str());
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(state_in(r.dir.path()), after);
}

TEST_F(committing_a_rewrite, gives_every_row_its_new_offset_also_those_that_did_not_change)
{
    rg_opaque_handle_t table = applied(r, 1);
    EXPECT_EQ(rg_commit_1(table), 0);
    const rg_i_table_t & t       = object(table);
    const bytes          content = read_file(r.path);
    for (kt_uint32_t i = 0; i < t.total_applied_rows; ++i) {
        const rg_i_index_entry_t & entry = t.p_rows_fixed_index[t.p_rows_packed_index[i]];
        EXPECT_EQ(+entry.applied_file_offset, 0u);
        EXPECT_EQ(rg_i_load_u32(content.data() + entry.file_offset + 8), kt_uint32_t{RG_RECORD_TYPE_ROW});
        EXPECT_EQ(std::memcmp(content.data() + entry.file_offset + 16, entry.p_committed + 4, 16), 0);
    }
    // And the file goes on from there.
    EXPECT_EQ(set(table, 3, 33), 0);
    EXPECT_EQ(remove(table, 1), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 6, {{3, 33}, {4, 40}}}));
}

TEST_F(committing_a_rewrite, that_cannot_rename_gives_the_code_and_leaves_no_rewrite_file)
{
    for (const auto & [the_errno, code] :
         {std::pair{EACCES, RG_E_ACCESS}, {ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}, {EIO, RG_E_SYSTEM_CALL}}) {
        registry_at        other;
        rg_opaque_handle_t table       = applied(other, 1);
        const size_t       descriptors = open_descriptors();
        fail_call(call::rename, 1, the_errno);
        EXPECT_EQ(rg_commit_1(table), code);
        EXPECT_EQ(error_code(), code);
        EXPECT_EQ(object(table).ready_for_commit, 2u);
        EXPECT_EQ(object(table).rewrite_file_fd, -1);
        EXPECT_EQ(open_descriptors(), descriptors - 1);
        EXPECT_FALSE(file_exists(other.rewrite));
        EXPECT_EQ(state_in(other.dir.path()), before);
        // A second commit has nothing to rename; an abort is the way on.
        EXPECT_EQ(rg_commit_1(table), RG_E_SYSTEM_CALL);
        EXPECT_NE(error_text().find("The rename system call unexpectedly returned an errno of 2"), std::string::npos);
        EXPECT_EQ(rg_abort_1(table), 0);
        EXPECT_EQ(object(table).ready_for_commit, 0u);
        EXPECT_EQ(rows_of(table), (rows{{1, 1}, {2, 2}, {3, 3}}));
        EXPECT_EQ(add(table, 9, 9), 0);
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), (file_state{0, 5, {{1, 1}, {2, 2}, {3, 3}, {9, 9}}}));
    }
}

TEST_F(committing_a_rewrite, without_memory_for_the_name_gives_12_and_leaves_no_rewrite_file)
{
    rg_opaque_handle_t table = applied(r, 1);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_commit_1(table), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(object(table).ready_for_commit, 2u);
    EXPECT_EQ(object(table).rewrite_file_fd, -1);
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), before);
}
