// SPDX-License-Identifier: MIT
// hold: asks for locks and closes the file again, before the library opens its own: closing any descriptor of a file
// gives up all locks that a process has on it.
#include "hold.h"

#include <cerrno>
#include <chrono>
#include <cstring>
#include <thread>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "failure.h"
#include "interrupt.h"
#include "kt_rg.h"

namespace ktrg
{

namespace
{

enum class holding { nobody, somebody, no_file };

failure refusal(const std::string & subject, int error)
{
    if (error == EROFS)
        return failure(exit_code::not_permitted, subject, "the file system is read-only", RG_E_ACCESS);
    if (error == EACCES || error == EPERM)
        return failure(exit_code::not_permitted, subject, "permission denied", RG_E_ACCESS);
    return failure(exit_code::input_output, subject, std::strerror(error), RG_E_SYSTEM_CALL);
}

holding holder_of(const std::string & file, const std::string & subject)
{
    const int fd = open(file.c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0 && errno == ENOENT)
        return holding::no_file;
    if (fd < 0)
        throw refusal(subject, errno);
    const bool held = lockf(fd, F_TEST, 0) != 0 && (errno == EACCES || errno == EAGAIN);
    close(fd);
    return held ? holding::somebody : holding::nobody;
}

// Asks again and again, until nobody holds it or the time is up.
template <class Question> void wait_until_free(const place & where, double wait_seconds, Question && is_held)
{
    using clock         = std::chrono::steady_clock;
    const auto deadline = clock::now() + std::chrono::duration<double>(wait_seconds);
    while (is_held()) {
        stop_if_interrupted();
        if (clock::now() >= deadline)
            throw failure(exit_code::busy, where.name,
                          wait_seconds > 0 ? "another process still holds the table"
                                           : "another process holds the table; --wait SECONDS waits for it");
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
}

} // namespace

void wait_while_held(const place & where, double wait_seconds)
{
    wait_until_free(where, wait_seconds, [&where] {
        const holding by = holder_of(where.file, where.name);
        if (by == holding::no_file)
            throw no_such_table(where);
        return by == holding::somebody;
    });
}

void wait_for_directory(const place & where, double wait_seconds)
{
    wait_until_free(where, wait_seconds,
                    [&where] { return holder_of(where.directory + "/,Lock", where.name) == holding::somebody; });
}

void wait_for_target(const place & where, double wait_seconds)
{
    wait_for_directory(where, wait_seconds);
    wait_until_free(where, wait_seconds, [&where] { return holder_of(where.file, where.name) == holding::somebody; });
}

file_hold::file_hold(const std::string & file, const std::string & subject)
    : fd_(open(file.c_str(), O_RDWR | O_CLOEXEC))
{
    if (fd_ < 0 && errno == ENOENT)
        return;
    if (fd_ < 0)
        throw refusal(subject, errno);
    if (lockf(fd_, F_TLOCK, 0) == 0)
        return;
    const int error = errno;
    close(fd_);
    if (error == EACCES || error == EAGAIN)
        throw failure(exit_code::busy, subject, "another process holds the table");
    throw refusal(subject, error);
}

file_hold::~file_hold()
{
    if (fd_ >= 0)
        close(fd_);
}

} // namespace ktrg
