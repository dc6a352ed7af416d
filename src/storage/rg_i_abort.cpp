// SPDX-License-Identifier: MIT
// rg_i_abort: throws away what is pending or applied, and returns the table to its last committed state.
//
// Layer: storage. Calls the file wrappers (rg_i_files); called by the frames, also when an implicit apply failed.
// Always holds: legal in every state of a table; the live commit record and what it stands for are as they were.
// Locking: the caller holds the table's write lock.
// Failure: nothing on the disk side can fail an abort; what doesn't work there is left behind as dead bytes.
#include <unistd.h>

#include <cstdint>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_table_file.h"
#include "table/rg_i_change_entries.h"
#include "table/rg_i_change_walk.h"

namespace
{

// `site` is the line of the call, by which a reader of a trace tells the places apart.
void trace(const rg_i_table_t & table, int site)
{
    tr_record_fmt_string_1(RG_I_TRACE_COMPONENT, 0xFFFFFFFFu, "DV|ABT|%.3d|%x|%u|%u|%u|%u|%u|%d|%d", site,
                           static_cast<kt_uint32_t>(reinterpret_cast<uintptr_t>(&table)), table.ready_for_commit,
                           table.commit_record_offset, table.applied_commit_record_offset, table.file_length,
                           table.rewrite_file_length, table.file_fd, table.rewrite_file_fd);
}

void throw_rewrite_file_away(rg_i_table_t & table)
{
    rg_i_give_up_rewrite_file(&table); // there is none any more after a failed rewrite commit
    table.rewrite_file_length = 0;
}

// Kept because callers depend on it: the length is made of the memory figures of the last open, which no commit
// updates. For a table created by this process it is 0, and the file is emptied; after commits since the open it may
// lie inside committed data.
void cut_applied_records_off(rg_i_table_t & table)
{
    trace(table, __LINE__);
    if (ftruncate(table.file_fd, off_t{table.commit_record_offset + table.commit_record_length}) != 0) {
        // The records stay behind the live commit record, as dead bytes.
    }
    if (rg_i_fdatasync(table.file_fd) == RG_E_FILESYSTEM_FULL_DETAIL)
        trace_filesystem_full_for_path(rg_i_set_data_path(&table));
}

void abort_on_disk(rg_i_table_t & table)
{
    if (table.ready_for_commit == 2)
        throw_rewrite_file_away(table);
    else if (table.ready_for_commit == 1)
        cut_applied_records_off(table);
    table.applied_commit_record_offset = 0;
    table.applied_commit_record_length = 0;
}

// Gives a row that existed before the transaction its committed version back.
void abort_row(rg_i_table_t & table, rg_i_index_entry_t & entry)
{
    if (entry.p_applied != nullptr && entry.p_applied != entry.p_committed)
        rg_i_rb_free_record(&table.record_buffer_pool, entry.p_applied);
    entry.p_applied           = entry.p_committed;
    entry.applied_file_offset = 0;
    entry.p_pending_change    = nullptr;
}

} // namespace

kt_int32_t rg_i_abort(rg_i_table_t * p_table)
{
    trace(*p_table, __LINE__);
    if (p_table->p_file_path != nullptr)
        abort_on_disk(*p_table);

    if (const kt_int32_t rc = rg_i_abort_in_memory(p_table, p_table->p_rows_change_list); rc != 0) {
        trace(*p_table, __LINE__);
        return rc;
    }
    if (const kt_int32_t rc = rg_i_abort_in_memory(p_table, p_table->p_delete_rows_change_list); rc != 0) {
        trace(*p_table, __LINE__);
        return rc;
    }
    rg_i_free_change_lists(p_table);
    rg_i_abort_application_metadata_buffer_updates(p_table->p_application_metadata);
    p_table->applied_deletions = 0;
    p_table->ready_for_commit  = 0;
    trace(*p_table, __LINE__);
    return 0;
}

kt_int32_t rg_i_abort_in_memory(rg_i_table_t * p_table, rg_i_change_entry_t * p_current_change_entry)
{
    const gathered_frees frees(p_table->record_buffer_pool, rg_i_count_change_entries(p_table));
    return rg_i_for_each_change(*p_table, p_current_change_entry, [&](rg_i_index_entry_t & entry) -> kt_int32_t {
        if (entry.p_committed == nullptr)
            return rg_i_remove_row(p_table, &entry);
        abort_row(*p_table, entry);
        return 0;
    });
}
