// SPDX-License-Identifier: MIT
// rg_i_files: the four file calls of the transaction code, with one treatment of interrupted calls, short writes and a
// full file system.
//
// The writing three return 0, RG_E_FILESYSTEM_FULL_DETAIL without a record (the caller knows the path, and reports it
// with trace_filesystem_full_for_path), or RG_E_SYSTEM_CALL with its record. No locks, no state, no buffers.
#pragma once

#include <sys/types.h>
#include <sys/uio.h>

#include <cstddef>

#include "kt_types.h"

// How often a call that keeps being interrupted is made again, and how long to wait in between.
inline constexpr kt_int32_t  RG_I_RETRY_LIMIT                 = 100;
inline constexpr kt_uint32_t RG_I_RETRY_INTERVAL_MICROSECONDS = 10000;

// Writes all that the vector describes, which is total_bytes_to_write in sum: the function doesn't add up. What was
// written is added to *cumulative_bytes_written, also when the call fails half-way. The vector is used up.
[[nodiscard]] kt_int32_t rg_i_writev(kt_int32_t fd, struct iovec * io_vector, kt_uint32_t total_io_vector_elements,
                                     ssize_t total_bytes_to_write, kt_uint32_t * cumulative_bytes_written);

// A descriptor that doesn't survive exec, or -1 with errno as open left it and no record.
[[nodiscard]] int rg_i_open_file(const char * path, int OFlag, mode_t Mode);

[[nodiscard]] kt_int32_t rg_i_write(kt_int32_t fd, void * p_buffer, size_t total_bytes_to_write);

// Makes data and length durable. The name is a name only: the call made is fsync.
[[nodiscard]] kt_int32_t rg_i_fdatasync(kt_int32_t fd);
