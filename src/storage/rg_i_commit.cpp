// SPDX-License-Identifier: MIT
// rg_i_commit: makes what was applied the table's state. The second half of a transaction.
//
// Layer: storage. Calls the file wrappers (rg_i_files); called by the frames and by column changes.
// Always holds: one small act changes what a reader of the file finds: an overwrite of the old commit record's type, or
// the rename of the rewrite file. Memory follows the file, never the other way round, and no cancellation of the thread
// can come between the two.
// Locking: the caller holds the table's write lock.
// Failure: nothing is committed in memory, and the table stays applied. What the file holds is told at each step.
#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_table_file.h"
#include "table/rg_i_change_entries.h"
#include "table/rg_i_change_walk.h"

// The assertions of this file are part of what commit does: they hold in release builds too.
#undef NDEBUG
#include <cassert>

namespace
{

constexpr char module_version[] = "rg_i_commit 1.0";

// `site` is the line of the call, by which a reader of a trace tells the places apart.
void trace(const rg_i_table_t & table, int site)
{
    tr_record_fmt_string_1(RG_I_TRACE_COMPONENT, 0xFFFFFFFFu, "DV|COM|%.3d|%x|%u|%u|%u|%u|%u|%d|%d", site,
                           static_cast<kt_uint32_t>(reinterpret_cast<uintptr_t>(&table)), table.ready_for_commit,
                           table.commit_record_offset, table.applied_commit_record_offset, table.file_length,
                           table.rewrite_file_length, table.file_fd, table.rewrite_file_fd);
}

[[nodiscard]] int disable_cancellation()
{
    int       old_state  = 0;
    const int pthread_rc = pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &old_state);
    assert(pthread_rc == 0);
    return old_state;
}

void restore_cancellation(int old_state)
{
    int       ignored_state = 0;
    const int pthread_rc    = pthread_setcancelstate(old_state, &ignored_state);
    assert(pthread_rc == 0);
}

// One commit. `site` is the line of the exit.
struct commit_t {
    rg_i_table_t & table;
    int            site = 0;
};

[[nodiscard]] kt_int32_t leave(commit_t & commit, int site, kt_int32_t rc)
{
    commit.site = site;
    return rc;
}

void report_full(rg_i_table_t & table, kt_int32_t rc)
{
    if (rc == RG_E_FILESYSTEM_FULL_DETAIL)
        trace_filesystem_full_for_path(rg_i_set_data_path(&table));
}

// ---- Appended records ----

[[nodiscard]] bool seek_old_commit_type(const rg_i_table_t & table)
{
    constexpr off64_t type_offset = offsetof(rg_i_disk_record_metadata_t, type);
    const off64_t     offset      = off64_t{table.disk_commit_record_offset} + type_offset;
    return lseek64(table.file_fd, offset, SEEK_SET) >= 0;
}

// Kept because callers depend on it: a commit whose sync failed returns the result of the write that takes it back, and
// so 0 if that write worked. The table is still applied, which the next update shows with RG_E_APPLIED_UNCOMMITTED.
[[nodiscard]] kt_int32_t take_back_overwrite(commit_t & commit, kt_int32_t sync_rc)
{
    rg_i_table_t & table = commit.table;
    report_full(table, sync_rc);
    trace(table, __LINE__);

    kt_uint32_t live = RG_RECORD_TYPE_COMMIT;
    if (!seek_old_commit_type(table))
        return leave(commit, __LINE__, rg_i_fail_system_call(RG_HERE, "lseek64", errno));
    const kt_int32_t write_rc = rg_i_write(table.file_fd, &live, sizeof live);
    report_full(table, write_rc);
    if (write_rc != 0)
        return leave(commit, __LINE__, write_rc);
    report_full(table, rg_i_fdatasync(table.file_fd));
    return leave(commit, __LINE__, write_rc);
}

// The commit point is the write: it lets readers pass the old commit record.
[[nodiscard]] kt_int32_t commit_by_overwriting(commit_t & commit, bool * p_committed)
{
    rg_i_table_t & table      = commit.table;
    kt_uint32_t    superseded = RG_RECORD_TYPE_FREE;
    if (!seek_old_commit_type(table))
        return leave(commit, __LINE__, rg_i_fail_system_call(RG_HERE, "lseek64", errno));
    if (const kt_int32_t rc = rg_i_write(table.file_fd, &superseded, sizeof superseded); rc != 0) {
        report_full(table, rc);
        return leave(commit, __LINE__, rc);
    }
    if (const kt_int32_t rc = rg_i_fdatasync(table.file_fd); rc != 0)
        return take_back_overwrite(commit, rc);
    *p_committed = true;
    return 0;
}

// ---- The rewritten file ----

[[nodiscard]] kt_int32_t rename_failure(commit_t & commit, int the_errno)
{
    if (the_errno == EACCES)
        return leave(commit, __LINE__, rg_i_fail(RG_HERE, RG_E_ACCESS));
    if (the_errno == ENOSPC) {
        report_full(commit.table, RG_E_FILESYSTEM_FULL_DETAIL);
        return leave(commit, __LINE__, RG_E_FILESYSTEM_FULL_DETAIL);
    }
    return leave(commit, __LINE__, rg_i_fail_system_call(RG_HERE, "rename", the_errno));
}

// The commit point is the rename. The directory isn't synced: docs/RELIABILITY.md tells what comes of that.
[[nodiscard]] kt_int32_t commit_by_renaming(commit_t & commit, bool * p_committed)
{
    rg_i_table_t & table = commit.table;
    // Both names live in one buffer, and rename needs both at once.
    const owned_buffer rewrite_path(strdup(rg_i_set_rewrite_path(&table)));
    if (!rewrite_path) {
        const kt_int32_t rc = rg_i_fail_no_memory(RG_HERE);
        rg_i_give_up_rewrite_file(&table);
        return leave(commit, __LINE__, rc);
    }
    if (rename(rewrite_path.get(), rg_i_set_data_path(&table)) != 0) {
        const kt_int32_t rc = rename_failure(commit, errno);
        rg_i_give_up_rewrite_file(&table);
        return rc;
    }
    // The lock of the old file goes with its descriptor; apply took that of the new one.
    close(table.file_fd);
    table.file_fd         = table.rewrite_file_fd;
    table.rewrite_file_fd = -1;
    *p_committed          = true;
    return 0;
}

// ---- Memory ----

// A rewrite gave every row a new place, also rows that no list holds.
void move_rows_to_new_offsets(rg_i_table_t & table)
{
    kt_uint32_t rows_left = table.total_committed_rows;
    for (kt_uint32_t slot = 0; rows_left > 0 && slot < table.maximum_rows; ++slot) {
        rg_i_index_entry_t & entry = table.p_rows_fixed_index[slot];
        if (entry.p_committed == nullptr)
            continue;
        --rows_left;
        if (entry.applied_file_offset != 0) {
            entry.file_offset         = entry.applied_file_offset;
            entry.applied_file_offset = 0;
        }
    }
}

[[nodiscard]] kt_int32_t follow_in_memory(commit_t & commit)
{
    rg_i_table_t & table     = commit.table;
    const bool     rewritten = table.ready_for_commit == 2;
    if (rewritten) {
        table.file_length         = table.rewrite_file_length;
        table.rewrite_file_length = 0;
    }
    if (const kt_int32_t rc = rg_i_commit_in_memory(&table, table.p_rows_change_list); rc != 0)
        return leave(commit, __LINE__, rc);
    if (const kt_int32_t rc = rg_i_commit_in_memory(&table, table.p_delete_rows_change_list); rc != 0)
        return leave(commit, __LINE__, rc);

    rg_i_free_change_lists(&table);
    table.change_counter            = table.applied_change_counter;
    table.disk_commit_record_offset = table.disk_applied_commit_record_offset;
    table.disk_commit_record_length = table.disk_applied_commit_record_length;
    table.total_committed_rows      = table.total_applied_rows;
    if (rewritten)
        move_rows_to_new_offsets(table);
    rg_i_commit_application_metadata_buffer_updates(table.p_application_metadata);
    table.applied_deletions = 0;
    table.ready_for_commit  = 0;
    return leave(commit, __LINE__, 0);
}

[[nodiscard]] kt_int32_t commit_applied(commit_t & commit)
{
    if (commit.table.p_file_path != nullptr) {
        bool             committed = false;
        const kt_int32_t rc        = commit.table.ready_for_commit == 2 ? commit_by_renaming(commit, &committed)
                                                                        : commit_by_overwriting(commit, &committed);
        if (!committed)
            return rc; // 0 after a commit that was taken back
    }
    return follow_in_memory(commit);
}

// Makes the applied version of a row that stays its committed one.
void commit_row(rg_i_table_t & table, rg_i_index_entry_t & entry)
{
    if (entry.p_committed == nullptr) {
        entry.p_committed = entry.p_applied;
    } else if (entry.p_committed != entry.p_applied) {
        rg_i_rb_free_record(&table.record_buffer_pool, entry.p_committed);
        entry.p_committed = entry.p_applied;
        if (table.p_rows_hash_table != nullptr && entry.p_hash_table_element != nullptr)
            entry.p_hash_table_element->p_key_value = rg_i_row_key(&table, entry.p_applied);
    }
    entry.file_offset         = entry.applied_file_offset;
    entry.applied_file_offset = 0;
    entry.p_pending_change    = nullptr;
}

} // namespace

kt_int32_t rg_i_commit(rg_i_table_t * p_table)
{
    trace(*p_table, __LINE__);
    if (p_table->ready_for_commit == 0) {
        if (p_table->p_rows_change_list == nullptr && p_table->p_delete_rows_change_list == nullptr)
            return 0;
        return rg_i_fail(RG_HERE, RG_E_UNAPPLIED_TABLE);
    }

    commit_t         commit{*p_table};
    const int        old_state = disable_cancellation();
    const kt_int32_t rc        = commit_applied(commit);
    restore_cancellation(old_state);
    trace(*p_table, commit.site);
    return rc;
}

kt_int32_t rg_i_commit_in_memory(rg_i_table_t * p_table, rg_i_change_entry_t * p_current_change_entry)
{
    const gathered_frees frees(p_table->record_buffer_pool, rg_i_count_change_entries(p_table));
    return rg_i_for_each_change(*p_table, p_current_change_entry, [&](rg_i_index_entry_t & entry) -> kt_int32_t {
        if (entry.p_applied == nullptr)
            return rg_i_remove_row(p_table, &entry);
        commit_row(*p_table, entry);
        return 0;
    });
}
