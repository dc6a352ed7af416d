// SPDX-License-Identifier: MIT
// rg_i_create_persistent_table: brings a new table file into the file system whole or not at all.
//
// Layer: storage. Calls the transient creation and the file wrappers (rg_i_files); called by rg_x_create_table.
// Always holds: the file is prepared under the rewrite name and synced before rename gives it the table's name, so that
// a table file that exists holds a metadata record and a commit record. A crash leaves a stray rewrite file at most.
// Locking: the caller holds the tree's write lock. Between processes the rewrite file's lock decides, without waiting;
// it stays with the descriptor, so that the creator holds the table as one who opened it for writing does.
// Failure: no table. Once the rewrite file was opened it is removed by name, also where another process prepares the
// same table under that name: the other's rename fails then, and no table comes to harm.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_table_file.h"

namespace
{

constexpr char module_version[] = "rg_i_create_persistent_table 1.0";

[[nodiscard]] kt_int32_t full(kt_char_ptr_t p_path)
{
    trace_filesystem_full_for_path(p_path);
    return RG_E_FILESYSTEM_FULL_DETAIL;
}

// A rewrite file that a crash left is taken over: nobody reads behind the commit record that is written into it.
// *p_remove tells whether the failure takes the file away.
[[nodiscard]] kt_int32_t open_rewrite_file(rg_i_table_t & table, bool * p_remove)
{
    *p_remove             = false;
    table.rewrite_file_fd = rg_i_open_file(table.p_file_path, O_RDWR | O_CREAT, 0644);
    if (table.rewrite_file_fd >= 0) {
        *p_remove = true;
        return 0;
    }
    if (errno == EACCES)
        return rg_i_fail(RG_HERE, RG_E_ACCESS);
    if (errno == ENOSPC) {
        *p_remove = true;
        return full(table.p_file_path);
    }
    return rg_i_fail_system_call(RG_HERE, "open", errno);
}

// Who holds the lock is creating the same table at this moment.
[[nodiscard]] kt_int32_t lock_rewrite_file(rg_i_table_t & table)
{
    if (lockf(table.rewrite_file_fd, F_TLOCK, 0) == 0)
        return 0;
    // Kept because callers depend on it: of the errnos of a lock that is taken, EAGAIN doesn't mean that the table
    // exists.
    if (errno == EACCES || errno == EEXIST)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    return rg_i_fail_system_call(RG_HERE, "lockf", errno);
}

[[nodiscard]] kt_int32_t write_first_records(rg_i_table_t & table, kt_uint32_t * p_total_bytes_written)
{
    owned_buffer commit_record;
    if (const kt_int32_t rc = rg_i_create_commit_record(table.p_application_metadata, table.change_counter,
                                                        &table.disk_commit_record_length, commit_record.out());
        rc != 0)
        return rc;
    owned_buffer disk_metadata;
    if (const kt_int32_t rc = rg_i_convert_metadata_memory_record_to_disk_record(
            reinterpret_cast<kt_char_ptr_t>(rg_i_record_head(table.p_metadata_record_data)), disk_metadata.out());
        rc != 0)
        return rc;

    const kt_uint32_t metadata_length = rg_i_load_u32(disk_metadata.get());
    const kt_uint64_t total_bytes     = kt_uint64_t{metadata_length} + table.disk_commit_record_length;
    if (total_bytes > UINT32_MAX)
        return rg_i_fail_system_call(RG_HERE, "writev", EFBIG);
    struct iovec io_vector[2] = {{disk_metadata.get(), metadata_length},
                                 {commit_record.get(), table.disk_commit_record_length}};
    if (const kt_int32_t rc =
            rg_i_writev(table.rewrite_file_fd, io_vector, 2, static_cast<ssize_t>(total_bytes), p_total_bytes_written);
        rc != 0)
        return rc == RG_E_FILESYSTEM_FULL_DETAIL ? full(table.p_file_path) : rc;
    if (const kt_int32_t rc = rg_i_fdatasync(table.rewrite_file_fd); rc != 0)
        return rc == RG_E_FILESYSTEM_FULL_DETAIL ? full(table.p_file_path) : rc;
    return 0;
}

// The table comes into being.
[[nodiscard]] kt_int32_t give_table_name(rg_i_table_t & table, kt_char_ptr_t p_file_name)
{
    if (rename(table.p_file_path, p_file_name) == 0)
        return 0;
    if (errno == EACCES)
        return rg_i_fail(RG_HERE, RG_E_ACCESS);
    if (errno == ENOSPC) {
        unlink(p_file_name);
        return full(p_file_name);
    }
    return rg_i_fail_system_call(RG_HERE, "rename", errno);
}

[[nodiscard]] kt_int32_t prepare_file(rg_i_table_t & table, kt_char_ptr_t p_file_name,
                                      kt_uint32_t * p_total_bytes_written)
{
    if (const kt_int32_t rc = lock_rewrite_file(table); rc != 0)
        return rc;
    struct stat existing;
    if (stat(p_file_name, &existing) == 0)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS); // it came into being since the caller looked
    if (const kt_int32_t rc = write_first_records(table, p_total_bytes_written); rc != 0)
        return rc;
    return give_table_name(table, p_file_name);
}

[[nodiscard]] kt_int32_t create_file(rg_i_table_t & table, kt_char_ptr_t p_name, kt_char_ptr_t p_file_name)
{
    if (const kt_int32_t rc = rg_i_name_table_file(&table, p_name, p_file_name); rc != 0)
        return rc;

    bool        remove              = false;
    kt_uint32_t total_bytes_written = 0;
    kt_int32_t  rc                  = open_rewrite_file(table, &remove);
    if (rc == 0)
        rc = prepare_file(table, p_file_name, &total_bytes_written);
    if (rc != 0) {
        if (remove)
            unlink(table.p_file_path);
        return rc;
    }

    rg_i_set_data_path(&table);
    table.file_length               = total_bytes_written;
    table.disk_commit_record_offset = total_bytes_written - table.disk_commit_record_length;
    table.file_fd                   = table.rewrite_file_fd;
    table.rewrite_file_fd           = -1;
    return 0;
}

} // namespace

kt_int32_t rg_i_create_persistent_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name, kt_char_ptr_t p_file_name,
                                        rg_column_t * p_columns, kt_uint32_t total_columns, kt_int32_t mode,
                                        kt_uint32_t block_size, rg_hash_table_t * p_rows_hash_table,
                                        rg_i_table_t ** p_table)
{
    if (p_file_name == nullptr) {
        if (p_rows_hash_table != nullptr)
            rg_i_hash_table_close(p_rows_hash_table);
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    }
    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = rg_i_create_transient_table(p_tree, p_file_name, p_columns, total_columns, mode,
                                                          p_rows_hash_table, &p_new_table);
        rc != 0)
        return rc;

    p_new_table->block_size = block_size;
    if (const kt_int32_t rc = create_file(*p_new_table, p_name, p_file_name); rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }
    *p_table = p_new_table;
    return 0;
}
