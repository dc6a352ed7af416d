// SPDX-License-Identifier: MIT
// rg_i_copy_to_file: makes a table file out of a table in memory, or out of another file.
//
// Layer: whole. Calls the file wrappers and what rewrites are made with (rg_i_table_image).
// Always holds: the file is prepared under the target's rewrite name, without a lock on it, synced, and only then given
// the target's name, so that a reader finds the old target or the whole new one. A stale rewrite file is taken over and
// not truncated. The source's rows aren't stamped: nothing of the new file concerns them.
// Locking: the directory's lock file and the target's file are locked, and a source object is read-locked.
// Failure: the target is as it was, and its rewrite file is gone.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "storage/rg_i_files.h"
#include "storage/rg_i_gathering_writer.h"
#include "storage/rg_i_table_file.h"
#include "storage/rg_i_table_image.h"
#include "whole/rg_i_duplicate_table.h"

namespace
{

constexpr char module_version[] = "rg_i_copy_to_file 1.0";

constexpr size_t bytes_at_a_time = 16384;

[[nodiscard]] kt_int32_t full_is_reported(kt_char_ptr_t p_path, kt_int32_t rc)
{
    if (rc == RG_E_FILESYSTEM_FULL_DETAIL)
        trace_filesystem_full_for_path(RG_HERE, p_path);
    return rc;
}

// What a failed open or rename of a table file means. A file that a rewrite makes can't be missing, so that ENOENT is
// an ordinary failure there.
enum class missing_file { is_no_such_table, is_a_failed_call };

[[nodiscard]] kt_int32_t fail_by_errno(const rg_i_site_t & site, const kt_char_t * p_call, kt_char_ptr_t p_path,
                                       missing_file missing)
{
    const int the_errno = errno;
    if (the_errno == ENOENT && missing == missing_file::is_no_such_table)
        return rg_i_fail(site, RG_E_NO_SUCH_TABLE);
    if (the_errno == EACCES)
        return rg_i_fail(site, RG_E_ACCESS);
    if (the_errno == ENOSPC)
        return full_is_reported(p_path, RG_E_FILESYSTEM_FULL_DETAIL);
    return rg_i_fail_system_call(site, p_call, the_errno);
}

[[nodiscard]] kt_int32_t open_rewrite_file(kt_char_ptr_t p_rewrite_path, unique_fd & file)
{
    file.reset(rg_i_open_file(p_rewrite_path, O_RDWR | O_CREAT, 0644));
    return file.get() >= 0 ? 0 : fail_by_errno(RG_HERE, "open", p_rewrite_path, missing_file::is_a_failed_call);
}

// ---- From memory ----

// What goes into the file besides the rows' own records. It must stay until it is written.
struct image_t {
    owned_buffer commit_record{};
    kt_uint32_t  commit_record_length = 0;
    owned_buffer metadata{};
    owned_buffer rows{};
};

[[nodiscard]] kt_uint64_t disk_length_of_rows(const rg_i_table_t & table)
{
    kt_uint64_t length = 0;
    (void)rg_i_for_each_applied_row(table, [&](const rg_i_index_entry_t & entry) {
        length += rg_i_disk_length_of(entry.p_applied);
        return 0;
    });
    return length;
}

// Kept because callers depend on it: a copy that gets no memory for its metadata or its rows takes the source's own
// rewrite file away too. If the source was applied by rewriting, its commit fails then.
[[nodiscard]] kt_int32_t give_up_rewrite_of_source(rg_i_table_t & table, kt_int32_t rc)
{
    if (table.p_file_path != nullptr)
        rg_i_give_up_rewrite_file(&table);
    return rc;
}

[[nodiscard]] kt_int32_t build_image(rg_i_table_t & table, image_t & image)
{
    // Kept because callers depend on it: the counter is the committed one, also where pending updates go along.
    if (const kt_int32_t rc = rg_i_create_commit_record(table.p_application_metadata, table.change_counter,
                                                        &image.commit_record_length, image.commit_record.out());
        rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_convert_metadata_to_disk_record(&table, image.metadata.out()); rc != 0)
        return give_up_rewrite_of_source(table, rc);

    const kt_uint64_t rows_length = disk_length_of_rows(table);
    if (rg_i_outgrows_offsets(rg_i_load_u32(image.metadata.get()) + rows_length + image.commit_record_length))
        return rg_i_fail_system_call(RG_HERE, "writev", EFBIG);
    image.rows.reset(static_cast<kt_char_ptr_t>(std::malloc(rows_length != 0 ? rows_length : 1)));
    if (!image.rows)
        return give_up_rewrite_of_source(table, rg_i_fail_no_memory(RG_HERE));
    return 0;
}

[[nodiscard]] kt_int32_t write_image(const rg_i_table_t & table, const image_t & image, int fd)
{
    struct iovec            vector[RG_I_IO_VECTOR_ELEMENTS];
    rg_i_gathering_writer_t writer{vector, fd, 0};
    rg_i_queue(writer, image.metadata.get(), rg_i_load_u32(image.metadata.get()));

    kt_char_ptr_t p_disk_record = image.rows.get();
    const auto    write_row     = [&](const rg_i_index_entry_t & entry) {
        rg_i_build_row_record(entry.p_applied, p_disk_record, row_record::stands_alone);
        return rg_i_queue_built(writer, image.rows.get(), &p_disk_record, rg_i_disk_length_of(entry.p_applied));
    };
    if (const kt_int32_t rc = rg_i_for_each_applied_row(table, write_row); rc != 0)
        return rc;
    rg_i_queue(writer, image.commit_record.get(), image.commit_record_length);
    if (const kt_int32_t rc = rg_i_write_queued(writer); rc != 0)
        return rc;
    return rg_i_fdatasync(fd);
}

[[nodiscard]] kt_int32_t fill_from_memory(rg_i_table_t & table, kt_char_ptr_t p_rewrite_path, int fd)
{
    image_t image;
    if (const kt_int32_t rc = build_image(table, image); rc != 0)
        return rc;
    return full_is_reported(p_rewrite_path, write_image(table, image, fd));
}

// ---- From a file ----

[[nodiscard]] kt_int32_t copy_bytes(int from, int to, kt_char_ptr_t p_rewrite_path)
{
    kt_char_t buffer[bytes_at_a_time];
    for (;;) {
        const ssize_t bytes = read(from, buffer, sizeof buffer);
        if (bytes < 0) // an interrupted read isn't made again
            return rg_i_fail_system_call(RG_HERE, "read", errno);
        if (bytes == 0)
            return full_is_reported(p_rewrite_path, rg_i_fdatasync(to));
        if (const kt_int32_t rc = rg_i_write(to, buffer, static_cast<size_t>(bytes)); rc != 0)
            return full_is_reported(p_rewrite_path, rc);
    }
}

[[nodiscard]] kt_int32_t fill_from_file(kt_char_ptr_t p_source_path, kt_char_ptr_t p_rewrite_path, int fd)
{
    const unique_fd source(rg_i_open_file(p_source_path, O_RDONLY, 0));
    if (source.get() < 0)
        return fail_by_errno(RG_HERE, "open", p_source_path, missing_file::is_no_such_table);
    return copy_bytes(source.get(), fd, p_rewrite_path);
}

} // namespace

kt_int32_t rg_i_rename_persistent_table(kt_char_ptr_t p_absolute_source_path, kt_char_ptr_t p_absolute_target_path)
{
    if (std::rename(p_absolute_source_path, p_absolute_target_path) == 0)
        return 0;
    return fail_by_errno(RG_HERE, "rename", p_absolute_target_path, missing_file::is_no_such_table);
}

kt_int32_t rg_i_duplicate_table_from_memory_to_persistent(rg_i_table_t * p_table, kt_char_ptr_t p_absolute_target_path,
                                                          kt_char_ptr_t p_absolute_target_rewrite_path)
{
    unique_fd file;
    if (const kt_int32_t rc = open_rewrite_file(p_absolute_target_rewrite_path, file); rc != 0)
        return rc;
    rollback remove_rewrite_file([&] { unlink(p_absolute_target_rewrite_path); });
    if (const kt_int32_t rc = fill_from_memory(*p_table, p_absolute_target_rewrite_path, file.get()); rc != 0)
        return rc;
    file.reset();
    if (const kt_int32_t rc = rg_i_rename_persistent_table(p_absolute_target_rewrite_path, p_absolute_target_path);
        rc != 0)
        return rc;
    remove_rewrite_file.dismiss();
    return 0;
}

kt_int32_t rg_i_duplicate_table_from_persistent_to_persistent(kt_char_ptr_t p_absolute_source_path,
                                                              kt_char_ptr_t p_absolute_target_path,
                                                              kt_char_ptr_t p_absolute_target_rewrite_path)
{
    unique_fd file;
    if (const kt_int32_t rc = open_rewrite_file(p_absolute_target_rewrite_path, file); rc != 0)
        return rc;
    rollback remove_rewrite_file([&] { unlink(p_absolute_target_rewrite_path); });
    if (const kt_int32_t rc = fill_from_file(p_absolute_source_path, p_absolute_target_rewrite_path, file.get());
        rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_rename_persistent_table(p_absolute_target_rewrite_path, p_absolute_target_path);
        rc != 0)
        return rc;
    remove_rewrite_file.dismiss();
    return 0;
}
