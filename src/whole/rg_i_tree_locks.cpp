// SPDX-License-Identifier: MIT
// rg_i_tree_locks: the file locks under which whole tables are copied and moved between processes.
//
// Layer: whole. Called by copies and moves into a directory.
// Always holds: first the directory's lock file, then the target's file. The lock file is made on first use and never
// removed. A target that doesn't exist is made empty, so that its name is taken until the finished table replaces it.
// Locking: the caller holds the tree's write lock, so that two threads never meet here; the waits run under it.
// Failure: what was opened here is closed. A target that was made empty stays.
#include "whole/rg_i_tree_locks.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "storage/rg_i_files.h"

namespace
{

constexpr char module_version[] = "rg_i_tree_locks 1.0";

constexpr kt_char_t lock_file[]   = "/,Lock";
constexpr size_t    room_for_name = 32;

[[nodiscard]] kt_int32_t open_target(kt_char_ptr_t p_path, unique_fd & target)
{
    target.reset(rg_i_open_file(p_path, O_RDWR | O_CREAT, 0644));
    if (target.get() >= 0)
        return 0;
    if (errno == ENOSPC) {
        trace_filesystem_full_for_path(RG_HERE, p_path);
        return RG_E_FILESYSTEM_FULL_DETAIL;
    }
    if (errno == EACCES)
        return rg_i_fail(RG_HERE, RG_E_ACCESS);
    return rg_i_fail_system_call(RG_HERE, "open", errno);
}

[[nodiscard]] kt_int32_t lock_and_measure(kt_int32_t target_fd, kt_int32_t * p_length)
{
    // A descriptor that the caller has may be that of a reader, which can't be locked: EBADF.
    if (lockf(target_fd, F_LOCK, 0) != 0)
        return rg_i_fail_system_call(RG_HERE, "lockf", errno);
    const off64_t length = lseek64(target_fd, 0, SEEK_END);
    if (length < 0)
        return rg_i_fail_system_call(RG_HERE, "lseek64", errno);
    *p_length = static_cast<kt_int32_t>(std::min<off64_t>(length, INT32_MAX));
    return 0;
}

} // namespace

kt_int32_t rg_i_lock_tree(const kt_char_t * p_absolute_path, kt_int32_t lock_type, kt_int32_t * fd)
{
    const kt_char_t * p_last = std::strrchr(p_absolute_path, '/');
    if (p_last == nullptr) // resolved paths always have one
        return rg_i_fail_internal(RG_HERE);
    const auto   directory_length = static_cast<size_t>(p_last - p_absolute_path);
    owned_buffer path(static_cast<kt_char_t *>(std::malloc(std::strlen(p_absolute_path) + room_for_name)));
    if (!path)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(path.get(), p_absolute_path, directory_length);
    std::memcpy(path.get() + directory_length, lock_file, sizeof lock_file);

    unique_fd lock_fd(rg_i_open_file(path.get(), O_RDWR | O_CREAT, 0644));
    // Kept because callers depend on it: a directory that is full or closed to us is an ordinary failed call here.
    if (lock_fd.get() < 0)
        return rg_i_fail_system_call(RG_HERE, "open", errno);
    if (lockf(lock_fd.get(), lock_type, 0) != 0)
        return rg_i_fail_system_call(RG_HERE, "lockf", errno);
    *fd = lock_fd.release();
    return 0;
}

kt_int32_t rg_i_lock_local_tree_and_target_table_if_it_exists(kt_char_ptr_t p_absolute_target_path,
                                                              kt_int32_t *  p_target_fd,
                                                              kt_int32_t *  p_local_tree_lock_fd,
                                                              kt_int32_t *  p_target_length)
{
    const kt_int32_t given_fd = *p_target_fd;
    *p_target_fd              = -1;
    *p_local_tree_lock_fd     = -1;
    *p_target_length          = 0;

    kt_int32_t tree_fd = -1;
    if (const kt_int32_t rc = rg_i_lock_tree(p_absolute_target_path, F_LOCK, &tree_fd); rc != 0)
        return rc;
    unique_fd tree_lock(tree_fd);
    unique_fd target;
    if (given_fd < 0)
        if (const kt_int32_t rc = open_target(p_absolute_target_path, target); rc != 0)
            return rc;
    if (const kt_int32_t rc = lock_and_measure(given_fd < 0 ? target.get() : given_fd, p_target_length); rc != 0)
        return rc;
    *p_target_fd          = given_fd < 0 ? target.release() : given_fd;
    *p_local_tree_lock_fd = tree_lock.release();
    return 0;
}
