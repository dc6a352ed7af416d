// SPDX-License-Identifier: MIT
// faults: the wrapped calls. See faults.h.
#include "support/faults.h"

#include <dirent.h>
#include <fcntl.h>
#include <pthread.h>
#include <search.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>

namespace kt_test
{

namespace
{

struct plan {
    std::atomic<unsigned> made{0};      // calls since the reset
    std::atomic<unsigned> fail_from{0}; // number of the first call that fails; 0: none
    unsigned              fail_times = 0;
    int                   the_errno  = 0;
    std::atomic<unsigned> shorten_at{0}; // number of the call that writes less; 0: none
    size_t                shorten_to = 0;
    std::atomic<unsigned> action_at{0}; // number of the call that an action runs ahead of; 0: none
    std::function<void()> action;
    std::atomic<bool>     failed{false};
};

std::array<plan, static_cast<size_t>(call::count_)> plans;
std::atomic<int>                                    longest{0};

plan & plan_of(call which)
{
    return plans[static_cast<size_t>(which)];
}

// Counts the call. True: it is to fail, and errno is set.
bool fails(call which, unsigned * p_number = nullptr)
{
    plan &         p      = plan_of(which);
    const unsigned number = ++p.made;
    if (p_number != nullptr)
        *p_number = number;
    if (p.action_at.load() == number) {
        p.action_at       = 0;
        const auto action = std::move(p.action); // it may plan another one
        action();
    }
    const unsigned from = p.fail_from.load();
    if (from == 0 || number < from || number - from >= p.fail_times)
        return false;
    p.failed = true;
    errno    = p.the_errno;
    return true;
}

} // namespace

unsigned calls_made(call which)
{
    return plan_of(which).made;
}

void fail_call(call which, unsigned nth, int the_errno, unsigned times)
{
    plan & p     = plan_of(which);
    p.the_errno  = the_errno;
    p.fail_times = times;
    p.failed     = false;
    p.fail_from  = p.made + nth;
}

void shorten_write(call which, unsigned nth, size_t bytes)
{
    plan & p     = plan_of(which);
    p.shorten_to = bytes;
    p.shorten_at = p.made + nth;
}

void before_call(call which, unsigned nth, std::function<void()> action)
{
    plan & p    = plan_of(which);
    p.action    = std::move(action);
    p.action_at = p.made + nth;
}

bool failed_as_asked(call which)
{
    return plan_of(which).failed;
}

int longest_writev()
{
    return longest;
}

void reset_calls()
{
    for (plan & p : plans) {
        p.fail_from  = 0;
        p.shorten_at = 0;
        p.action_at  = 0;
        p.made       = 0;
        p.failed     = false;
        p.action     = nullptr;
    }
    longest = 0;
}

} // namespace kt_test

using kt_test::call;
using kt_test::fails;

extern "C" {

void *  __real_malloc(size_t);
void *  __real_calloc(size_t, size_t);
void *  __real_realloc(void *, size_t);
void *  __real_aligned_alloc(size_t, size_t);
char *  __real_strdup(const char *);
void *  __real_tsearch(const void *, void **, int (*)(const void *, const void *));
int     __real_open(const char *, int, ...);
ssize_t __real_read(int, void *, size_t);
ssize_t __real_write(int, const void *, size_t);
ssize_t __real_writev(int, const iovec *, int);
int     __real_fsync(int);
off64_t __real_lseek64(int, off64_t, int);
int     __real_ftruncate(int, off_t);
int     __real_rename(const char *, const char *);
int     __real_unlink(const char *);
int     __real_lockf(int, int, off_t);
int     __real_stat(const char *, struct stat *);
DIR *   __real_opendir(const char *);
int     __real_mkdir(const char *, mode_t);
int     __real_usleep(useconds_t);
int     __real_pthread_mutex_lock(pthread_mutex_t *);
int     __real_pthread_mutex_unlock(pthread_mutex_t *);
int     __real_pthread_cond_wait(pthread_cond_t *, pthread_mutex_t *);
int     __real_pthread_cond_signal(pthread_cond_t *);
int     __real_pthread_cond_broadcast(pthread_cond_t *);
int     __real_pthread_atfork(void (*)(void), void (*)(void), void (*)(void));

void * __wrap_malloc(size_t size)
{
    return fails(call::allocation) ? nullptr : __real_malloc(size);
}

void * __wrap_calloc(size_t count, size_t size)
{
    return fails(call::allocation) ? nullptr : __real_calloc(count, size);
}

void * __wrap_realloc(void * p, size_t size)
{
    return fails(call::allocation) ? nullptr : __real_realloc(p, size);
}

void * __wrap_aligned_alloc(size_t alignment, size_t size)
{
    return fails(call::allocation) ? nullptr : __real_aligned_alloc(alignment, size);
}

char * __wrap_strdup(const char * p)
{
    return fails(call::allocation) ? nullptr : __real_strdup(p);
}

void * __wrap_tsearch(const void * key, void ** root, int (*compare)(const void *, const void *))
{
    return fails(call::allocation) ? nullptr : __real_tsearch(key, root, compare);
}

int __wrap_open(const char * path, int flags, ...)
{
    mode_t mode = 0;
    if ((flags & O_CREAT) != 0) {
        va_list ap;
        va_start(ap, flags);
        mode = va_arg(ap, mode_t);
        va_end(ap);
    }
    return fails(call::open) ? -1 : __real_open(path, flags, mode);
}

ssize_t __wrap_read(int fd, void * p, size_t size)
{
    return fails(call::read) ? -1 : __real_read(fd, p, size);
}

ssize_t __wrap_write(int fd, const void * p, size_t size)
{
    unsigned number = 0;
    if (fails(call::write, &number))
        return -1;
    const auto & plan = kt_test::plan_of(call::write);
    return __real_write(fd, p, plan.shorten_at == number ? std::min(size, plan.shorten_to) : size);
}

ssize_t __wrap_writev(int fd, const iovec * p_vector, int count)
{
    unsigned number  = 0;
    kt_test::longest = std::max(kt_test::longest.load(), count);
    if (fails(call::writev, &number))
        return -1;
    const auto & plan = kt_test::plan_of(call::writev);
    if (plan.shorten_at != number)
        return __real_writev(fd, p_vector, count);

    ssize_t written = 0;
    size_t  left    = plan.shorten_to;
    for (int i = 0; i < count && left > 0; ++i) {
        const ssize_t n = __real_write(fd, p_vector[i].iov_base, std::min(left, p_vector[i].iov_len));
        if (n < 0)
            return written > 0 ? written : -1;
        written += n;
        left -= static_cast<size_t>(n);
    }
    return written;
}

int __wrap_fsync(int fd)
{
    return fails(call::fsync) ? -1 : __real_fsync(fd);
}

off64_t __wrap_lseek64(int fd, off64_t offset, int whence)
{
    return fails(call::lseek) ? -1 : __real_lseek64(fd, offset, whence);
}

int __wrap_ftruncate(int fd, off_t length)
{
    return fails(call::ftruncate) ? -1 : __real_ftruncate(fd, length);
}

int __wrap_rename(const char * from, const char * to)
{
    return fails(call::rename) ? -1 : __real_rename(from, to);
}

int __wrap_unlink(const char * path)
{
    return fails(call::unlink) ? -1 : __real_unlink(path);
}

int __wrap_lockf(int fd, int command, off_t length)
{
    return fails(call::lockf) ? -1 : __real_lockf(fd, command, length);
}

int __wrap_stat(const char * path, struct stat * p_stat)
{
    return fails(call::stat) ? -1 : __real_stat(path, p_stat);
}

DIR * __wrap_opendir(const char * path)
{
    return fails(call::opendir) ? nullptr : __real_opendir(path);
}

int __wrap_mkdir(const char * path, mode_t mode)
{
    return fails(call::mkdir) ? -1 : __real_mkdir(path, mode);
}

int __wrap_usleep(useconds_t time)
{
    return fails(call::usleep) ? 0 : __real_usleep(time);
}

int __wrap_pthread_mutex_lock(pthread_mutex_t * p)
{
    return fails(call::mutex_lock) ? errno : __real_pthread_mutex_lock(p);
}

int __wrap_pthread_mutex_unlock(pthread_mutex_t * p)
{
    return fails(call::mutex_unlock) ? errno : __real_pthread_mutex_unlock(p);
}

int __wrap_pthread_cond_wait(pthread_cond_t * p_condition, pthread_mutex_t * p)
{
    return fails(call::cond_wait) ? errno : __real_pthread_cond_wait(p_condition, p);
}

int __wrap_pthread_cond_signal(pthread_cond_t * p)
{
    return fails(call::cond_signal) ? errno : __real_pthread_cond_signal(p);
}

int __wrap_pthread_cond_broadcast(pthread_cond_t * p)
{
    return fails(call::cond_broadcast) ? errno : __real_pthread_cond_broadcast(p);
}

int __wrap_pthread_atfork(void (*prepare)(void), void (*parent)(void), void (*child)(void))
{
    return fails(call::atfork) ? errno : __real_pthread_atfork(prepare, parent, child);
}

} // extern "C"
