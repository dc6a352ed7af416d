// SPDX-License-Identifier: MIT
// rg_i_apply: writes everything pending, and syncs it. The first half of a transaction.
//
// Layer: storage. Calls the file wrappers (rg_i_files); called by the frames and by column changes.
// Always holds: a reader of the table file stops at the old commit record until rg_i_commit acts. No byte up to the end
// of the live commit record is touched. Appending writes behind it; rewriting writes the whole table into the rewrite
// file. Either way a call has 16 elements at most, and there is one sync.
// Locking: the caller holds the table's write lock.
// Failure: ready_for_commit stays 0, and lists and records stay as they were: the caller may apply again, or abort.
// Stamps of file offsets stay; the next apply overwrites those of the rows that it writes.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_gathering_writer.h"
#include "storage/rg_i_table_file.h"
#include "storage/rg_i_table_image.h"
#include "table/rg_i_change_walk.h"

namespace
{

constexpr char module_version[] = "rg_i_apply 1.0";

constexpr kt_uint32_t smallest_file_to_rewrite = 16384;
constexpr kt_uint32_t live_percent_to_keep     = 50;

// One apply: what it works on and what it owns. All of it goes when the apply ends, since the vector points into it.
struct apply_t {
    rg_i_table_t &    table;
    const kt_uint32_t rewrite;
    int               site = 0; // line of the exit, by which a reader of a trace tells the exits apart
    owned_buffer      commit_record{};
    owned_buffer      disk_metadata{};
    owned_buffer      rows{};
    owned_buffer      deleted_rows{};
};

[[nodiscard]] kt_int32_t leave(apply_t & apply, int site, kt_int32_t rc)
{
    apply.site = site;
    return rc;
}

void trace_exit(const apply_t & apply)
{
    const rg_i_table_t & table = apply.table;
    tr_record_fmt_string_1(RG_I_TRACE_COMPONENT, 0xFFFFFFFFu, "DV|APP|%.3d|%x|%u|%u|%u|%u|%u|%d|%d|%u", apply.site,
                           static_cast<kt_uint32_t>(reinterpret_cast<uintptr_t>(&table)), table.ready_for_commit,
                           table.disk_commit_record_offset, table.disk_applied_commit_record_offset, table.file_length,
                           table.rewrite_file_length, table.file_fd, table.rewrite_file_fd, apply.rewrite);
}

// ---- The rows that go out ----

// Runs an action for the index entry of each row that this apply writes: in a rewrite every row that has an applied
// record, in ascending fixed index; else the rows of the change list, in the order in which they first changed. Stops
// at the first non-zero result.
template <class Action> [[nodiscard]] kt_int32_t for_each_written_row(const apply_t & apply, Action action)
{
    rg_i_table_t & table = apply.table;
    if (apply.rewrite != 0)
        return rg_i_for_each_applied_row(table, action);
    return rg_i_for_each_change(table, table.p_rows_change_list, [&](rg_i_index_entry_t & entry) {
        return entry.p_applied != nullptr ? action(entry) : 0;
    });
}

[[nodiscard]] kt_uint64_t disk_length_of_rows(const apply_t & apply)
{
    kt_uint64_t length = 0;
    (void)for_each_written_row(apply, [&](const rg_i_index_entry_t & entry) {
        length += rg_i_disk_length_of(entry.p_applied);
        return 0;
    });
    return length;
}

// One buffer, with room for all rows: memory that isn't there is found out before anything is written. Little of it is
// touched, since it is begun anew after each write.
[[nodiscard]] bool allocate_rows(apply_t & apply, kt_uint64_t disk_length)
{
    apply.rows.reset(static_cast<kt_char_ptr_t>(std::malloc(disk_length != 0 ? disk_length : 1)));
    return static_cast<bool>(apply.rows);
}

// Builds the file form of the row's applied record, and stamps the row with the place that it will have.
void build_row_record(const apply_t & apply, rg_i_index_entry_t & entry, kt_char_ptr_t p_disk_record,
                      kt_uint32_t file_offset)
{
    rg_i_build_row_record(entry.p_applied, p_disk_record,
                          apply.rewrite != 0 ? row_record::stands_alone : row_record::keeps_replaces_offset);
    rg_i_record_head(entry.p_applied)->disk_table_offset = file_offset;
    entry.applied_file_offset                            = file_offset;
}

[[nodiscard]] kt_int32_t write_rows(const apply_t & apply, rg_i_gathering_writer_t & writer)
{
    kt_char_ptr_t p_disk_record = apply.rows.get();
    return for_each_written_row(apply, [&](rg_i_index_entry_t & entry) {
        build_row_record(apply, entry, p_disk_record, writer.file_offset);
        return rg_i_queue_built(writer, apply.rows.get(), &p_disk_record, rg_i_disk_length_of(entry.p_applied));
    });
}

// Ends the group. The commit record goes out with what is queued.
[[nodiscard]] kt_int32_t write_commit_record(const apply_t & apply, rg_i_gathering_writer_t & writer)
{
    rg_i_queue(writer, apply.commit_record.get(), apply.table.disk_applied_commit_record_length);
    return rg_i_write_queued(writer);
}

// ---- Rewriting ----

[[nodiscard]] kt_int32_t full_is_reported(rg_i_table_t & table, kt_int32_t rc)
{
    if (rc == RG_E_FILESYSTEM_FULL_DETAIL)
        trace_filesystem_full_for_path(rg_i_set_rewrite_path(&table));
    return rc;
}

[[nodiscard]] kt_int32_t open_rewrite_file(apply_t & apply)
{
    rg_i_table_t & table  = apply.table;
    table.rewrite_file_fd = rg_i_open_file(rg_i_set_rewrite_path(&table), O_RDWR | O_CREAT, 0644);
    if (table.rewrite_file_fd >= 0)
        return 0;
    if (errno == EACCES)
        return leave(apply, __LINE__, rg_i_fail(RG_HERE, RG_E_ACCESS));
    if (errno == ENOSPC)
        return leave(apply, __LINE__, full_is_reported(table, RG_E_FILESYSTEM_FULL_DETAIL));
    return leave(apply, __LINE__, rg_i_fail_system_call(RG_HERE, "open", errno));
}

// From the locked file to the synced one.
[[nodiscard]] kt_int32_t fill_rewrite_file(apply_t & apply)
{
    rg_i_table_t & table = apply.table;
    // The lock is held from here on: after the commit this is the table file.
    if (lockf(table.rewrite_file_fd, F_LOCK, 0) != 0)
        return leave(apply, __LINE__, rg_i_fail_system_call(RG_HERE, "lockf", errno));

    if (const kt_int32_t rc = rg_i_convert_metadata_to_disk_record(&table, apply.disk_metadata.out()); rc != 0)
        return leave(apply, __LINE__, rc);

    const kt_uint32_t metadata_length = rg_i_load_u32(apply.disk_metadata.get());
    const kt_uint64_t rows_length     = disk_length_of_rows(apply);
    if (rg_i_outgrows_offsets(metadata_length + rows_length + table.disk_applied_commit_record_length))
        return leave(apply, __LINE__, rg_i_fail_system_call(RG_HERE, "writev", EFBIG));
    if (!allocate_rows(apply, rows_length))
        return leave(apply, __LINE__, rg_i_fail_no_memory(RG_HERE));

    rg_i_gathering_writer_t writer{table.io_vector, table.rewrite_file_fd, 0};
    rg_i_queue(writer, apply.disk_metadata.get(), metadata_length);
    if (const kt_int32_t rc = write_rows(apply, writer); rc != 0)
        return leave(apply, __LINE__, full_is_reported(table, rc));
    const kt_uint32_t commit_record_offset = writer.file_offset;
    if (const kt_int32_t rc = write_commit_record(apply, writer); rc != 0)
        return leave(apply, __LINE__, full_is_reported(table, rc));
    if (const kt_int32_t rc = rg_i_fdatasync(table.rewrite_file_fd); rc != 0)
        return leave(apply, __LINE__, full_is_reported(table, rc));

    table.disk_applied_commit_record_offset = commit_record_offset;
    table.rewrite_file_length               = writer.written;
    table.ready_for_commit                  = 2;
    return 0;
}

// An older rewrite file is taken over and not truncated: what it has beyond the new commit record is read by nobody.
[[nodiscard]] kt_int32_t apply_by_rewriting(apply_t & apply)
{
    if (const kt_int32_t rc = open_rewrite_file(apply); rc != 0)
        return rc;
    const kt_int32_t rc = fill_rewrite_file(apply);
    if (rc != 0)
        rg_i_give_up_rewrite_file(&apply.table);
    return rc;
}

// ---- Appending ----

// Rows of the delete list that the file knows: a row added and deleted in one transaction isn't there.
[[nodiscard]] kt_uint32_t count_deleted_rows(const rg_i_table_t & table)
{
    kt_uint32_t count = 0;
    for (const rg_i_change_entry_t * p_change = table.p_delete_rows_change_list; p_change != nullptr;
         p_change                             = p_change->p_next)
        if (p_change->p_index_entry->p_committed != nullptr)
            ++count;
    return count;
}

[[nodiscard]] kt_uint64_t deleted_rows_length(kt_uint32_t count)
{
    return count == 0 ? 0 : sizeof(rg_i_disk_deleted_rows_record_t) + kt_uint64_t{count} * sizeof(kt_uint32_t);
}

void build_deleted_rows_record(const apply_t & apply, kt_uint32_t count)
{
    kt_char_ptr_t p = apply.deleted_rows.get();
    rg_i_store(p, rg_i_disk_deleted_rows_record_t{
                      {static_cast<kt_uint32_t>(deleted_rows_length(count)), 0, RG_RECORD_TYPE_DELETED_ROWS}, count});
    p += sizeof(rg_i_disk_deleted_rows_record_t);
    for (const rg_i_change_entry_t * p_change = apply.table.p_delete_rows_change_list; p_change != nullptr;
         p_change                             = p_change->p_next) {
        const rg_i_index_entry_t & entry = *p_change->p_index_entry;
        if (entry.p_committed == nullptr)
            continue;
        // Kept because callers depend on it: the offset is the record's stamp and not the slot's file_offset. After the
        // abort of a rewrite the stamp names a place in the file that was thrown away.
        rg_i_store_u32(p, rg_i_record_head(entry.p_committed)->disk_table_offset);
        p += sizeof(kt_uint32_t);
    }
}

// At most one a transaction, behind all rows.
[[nodiscard]] kt_int32_t write_deleted_rows(apply_t & apply, rg_i_gathering_writer_t & writer, kt_uint32_t count)
{
    apply.deleted_rows.reset(static_cast<kt_char_ptr_t>(std::malloc(deleted_rows_length(count))));
    if (!apply.deleted_rows)
        return leave(apply, __LINE__, rg_i_fail_no_memory(RG_HERE));
    build_deleted_rows_record(apply, count);
    rg_i_queue(writer, apply.deleted_rows.get(), static_cast<kt_uint32_t>(deleted_rows_length(count)));
    if (const kt_int32_t rc = rg_i_write_if_full(writer); rc != 0)
        return leave(apply, __LINE__, rc);
    return 0;
}

[[nodiscard]] kt_int32_t apply_by_appending(apply_t & apply)
{
    rg_i_table_t &    table = apply.table;
    const kt_uint64_t start = kt_uint64_t{table.disk_commit_record_offset} + table.disk_commit_record_length;
    if (lseek64(table.file_fd, static_cast<off64_t>(start), SEEK_SET) < 0)
        return leave(apply, __LINE__, rg_i_fail_system_call(RG_HERE, "lseek64", errno));

    const kt_uint64_t rows_length   = disk_length_of_rows(apply);
    const kt_uint32_t deleted_count = count_deleted_rows(table);
    if (rg_i_outgrows_offsets(start + rows_length + deleted_rows_length(deleted_count) +
                              table.disk_applied_commit_record_length))
        return leave(apply, __LINE__, rg_i_fail_system_call(RG_HERE, "writev", EFBIG));

    rg_i_gathering_writer_t writer{table.io_vector, table.file_fd, static_cast<kt_uint32_t>(start)};
    if (table.p_rows_change_list != nullptr) {
        if (!allocate_rows(apply, rows_length)) {
            // Kept because callers depend on it: an append that gets no memory for its rows takes a stale rewrite file
            // away as well. Its own descriptor isn't touched.
            rg_i_give_up_rewrite_file(&table);
            return leave(apply, __LINE__, rg_i_fail_no_memory(RG_HERE));
        }
        if (const kt_int32_t rc = write_rows(apply, writer); rc != 0)
            return leave(apply, __LINE__, full_is_reported(table, rc));
    }
    if (deleted_count != 0)
        if (const kt_int32_t rc = write_deleted_rows(apply, writer, deleted_count); rc != 0)
            return full_is_reported(table, rc);
    const kt_uint32_t commit_record_offset = writer.file_offset;
    if (const kt_int32_t rc = write_commit_record(apply, writer); rc != 0)
        return leave(apply, __LINE__, full_is_reported(table, rc));
    if (const kt_int32_t rc = rg_i_fdatasync(table.file_fd); rc != 0)
        return leave(apply, __LINE__, full_is_reported(table, rc));

    const auto file_end                     = static_cast<kt_uint32_t>(start + writer.written);
    table.disk_applied_commit_record_offset = commit_record_offset;
    if (file_end > table.disk_file_length)
        table.disk_file_length = file_end;
    table.ready_for_commit = 1;
    return 0;
}

[[nodiscard]] kt_int32_t apply_pending(apply_t & apply, kt_uint64_t table_change_counter)
{
    rg_i_table_t & table = apply.table;
    if (table.ready_for_commit != 0)
        return leave(apply, __LINE__, rg_i_fail(RG_HERE, RG_E_APPLIED_UNCOMMITTED));

    const bool counts_by_itself  = table_change_counter == 0 || table.implicitly_controlled != 0;
    table.applied_change_counter = counts_by_itself ? table.change_counter + 1 : table_change_counter;
    if (table.p_file_path == nullptr) {
        table.ready_for_commit = 1;
        return leave(apply, __LINE__, 0);
    }

    if (const kt_int32_t rc =
            rg_i_create_commit_record(table.p_application_metadata, table.applied_change_counter,
                                      &table.disk_applied_commit_record_length, apply.commit_record.out());
        rc != 0)
        return leave(apply, __LINE__, rc);
    if (const kt_int32_t rc = apply.rewrite != 0 ? apply_by_rewriting(apply) : apply_by_appending(apply); rc != 0) {
        rg_i_set_rewrite_path(&table);
        return rc;
    }
    return leave(apply, __LINE__, 0);
}

} // namespace

kt_uint32_t rg_i_rewrite_is_due(const rg_i_table_t * p_table)
{
    if (p_table->file_length <= smallest_file_to_rewrite)
        return 0;
    // Kept because callers depend on it: the product wraps at 32 bits, and exactly 50 percent doesn't rewrite.
    const kt_uint32_t live_percent = p_table->record_buffer_pool.used_bytes * 100u / p_table->file_length;
    return live_percent < live_percent_to_keep ? 1 : 0;
}

kt_int32_t rg_i_apply(rg_i_table_t * p_table, kt_uint32_t rewrite, kt_uint64_t table_change_counter)
{
    apply_t          apply{*p_table, rewrite};
    const kt_int32_t rc = apply_pending(apply, table_change_counter);
    trace_exit(apply);
    return rc;
}
