// SPDX-License-Identifier: MIT
// rg_i_files: the file calls of the transaction code.
//
// Layer: storage, at the bottom. Called by the creation and opening of table files, apply, commit and abort.
// Always holds: EINTR alone is retried; the retries of one operation are counted together, also across partial writes;
// whoever leaves after a retry says so in one development line.
// Locking: none; the callers hold the table's write lock or the tree's, and the pauses are slept under it.
// Failure: bytes already written stay where they are. Harmless: callers write behind the live commit record or into a
// rewrite file, where no reader looks.
#include "storage/rg_i_files.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_files 1.0";

// The interruptions of one operation.
struct retry_count_t {
    kt_uint32_t retries = 0;

    // Whether the failed call is to be made again; waits ahead of that.
    [[nodiscard]] bool again(int the_errno)
    {
        if (the_errno != EINTR || retries >= RG_I_RETRY_LIMIT)
            return false;
        ++retries;
        usleep(RG_I_RETRY_INTERVAL_MICROSECONDS);
        return true;
    }

    // The way out: tells the trace how often the call was made again. `line` is the number of the exit.
    void leave(int line) const
    {
        if (retries != 0)
            tr_record_fmt_string_1(RG_I_TRACE_COMPONENT, 0xFFFFFFFFu, "DV|RET|%.3d|%u|%d", line, retries,
                                   RG_I_RETRY_LIMIT);
    }
};

// A write of something that wrote nothing counts as interrupted, so that it can't be repeated without end.
[[nodiscard]] int errno_of(ssize_t result)
{
    return result < 0 ? errno : EINTR;
}

// Takes what was written off the front of the vector. An element written exactly stays, with length 0.
void drop_written(struct iovec ** p_p_element, kt_uint32_t * p_elements, size_t written)
{
    while (*p_elements > 1 && written > (*p_p_element)->iov_len) {
        written -= (*p_p_element)->iov_len;
        ++*p_p_element;
        --*p_elements;
    }
    (*p_p_element)->iov_base = static_cast<kt_char_ptr_t>((*p_p_element)->iov_base) + written;
    (*p_p_element)->iov_len -= written;
}

} // namespace

kt_int32_t rg_i_writev(kt_int32_t fd, struct iovec * io_vector, kt_uint32_t total_io_vector_elements,
                       ssize_t total_bytes_to_write, kt_uint32_t * cumulative_bytes_written)
{
    retry_count_t count;
    for (;;) {
        const ssize_t result = writev(fd, io_vector, static_cast<int>(total_io_vector_elements));
        if (result == total_bytes_to_write) {
            *cumulative_bytes_written += static_cast<kt_uint32_t>(result);
            count.leave(__LINE__);
            return 0;
        }
        if (result > 0) {
            *cumulative_bytes_written += static_cast<kt_uint32_t>(result);
            total_bytes_to_write -= result;
            drop_written(&io_vector, &total_io_vector_elements, static_cast<size_t>(result));
            continue;
        }
        const int the_errno = errno_of(result);
        if (count.again(the_errno))
            continue;
        if (the_errno == ENOSPC) {
            count.leave(__LINE__);
            return RG_E_FILESYSTEM_FULL_DETAIL;
        }
        count.leave(__LINE__);
        return rg_i_fail_system_call(RG_HERE, "writev", the_errno);
    }
}

int rg_i_open_file(const char * path, int OFlag, mode_t Mode)
{
    retry_count_t count;
    for (;;) {
        const int fd = open(path, OFlag, Mode);
        if (fd >= 0) {
            if (const int flags = fcntl(fd, F_GETFD); flags != -1)
                fcntl(fd, F_SETFD, flags | FD_CLOEXEC);
            count.leave(__LINE__);
            return fd;
        }
        const int the_errno = errno;
        if (count.again(the_errno))
            continue;
        count.leave(__LINE__);
        errno = the_errno; // the trace may have changed it
        return -1;
    }
}

kt_int32_t rg_i_write(kt_int32_t fd, void * p_buffer, size_t total_bytes_to_write)
{
    retry_count_t count;
    kt_char_ptr_t p_rest = static_cast<kt_char_ptr_t>(p_buffer);
    for (;;) {
        const ssize_t result = write(fd, p_rest, total_bytes_to_write);
        if (result >= 0 && static_cast<size_t>(result) == total_bytes_to_write) {
            count.leave(__LINE__);
            return 0;
        }
        if (result > 0) {
            p_rest += result;
            total_bytes_to_write -= static_cast<size_t>(result);
            continue;
        }
        const int the_errno = errno_of(result);
        if (count.again(the_errno))
            continue;
        if (the_errno == ENOSPC) {
            count.leave(__LINE__);
            return RG_E_FILESYSTEM_FULL_DETAIL;
        }
        count.leave(__LINE__);
        return rg_i_fail_system_call(RG_HERE, "write", the_errno);
    }
}

kt_int32_t rg_i_fdatasync(kt_int32_t fd)
{
    retry_count_t count;
    for (;;) {
        if (fsync(fd) == 0) {
            count.leave(__LINE__);
            return 0;
        }
        const int the_errno = errno;
        // Each failed attempt leaves its witness in the working directory, an interrupted one too.
        rg_i_capture_errno(const_cast<char *>("fdatasync"), the_errno, __LINE__, const_cast<char *>(module_version));
        if (count.again(the_errno))
            continue;
        if (the_errno == ENOSPC) {
            count.leave(__LINE__);
            return RG_E_FILESYSTEM_FULL_DETAIL;
        }
        count.leave(__LINE__);
        return rg_i_fail_system_call(RG_HERE, "fdatasync", the_errno);
    }
}
