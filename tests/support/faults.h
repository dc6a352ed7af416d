// SPDX-License-Identifier: MIT
// faults: counts the calls that the libraries make into the C library, and makes chosen ones fail.
//
// The test programs are linked with --wrap for each of these calls, so every call from the libraries' objects (and from
// the tests' own) comes through here. Allocations are malloc, calloc, realloc, aligned_alloc, strdup
// and tsearch together.
#pragma once

#include <cstdint>
#include <functional>

namespace kt_test
{

enum class call {
    allocation, // fails by returning NULL
    open,
    read,
    write,
    writev,
    fsync,
    lseek,
    ftruncate,
    rename,
    unlink,
    lockf,
    stat,
    opendir,
    mkdir,
    usleep,
    mutex_lock, // the pthread calls fail by returning the errno
    mutex_unlock,
    cond_wait,
    cond_signal,
    cond_broadcast,
    atfork,
    count_ // how many there are
};

// Calls made since the last reset.
unsigned calls_made(call which);

// Makes the nth call from now (1 is the next) and the times - 1 ones behind it fail with the errno.
void               fail_call(call which, unsigned nth, int the_errno, unsigned times = 1);
constexpr unsigned for_good = UINT32_MAX;

// Makes the nth write or writev from now write only so many bytes.
void shorten_write(call which, unsigned nth, size_t bytes);

// Runs an action ahead of the nth call from now: for races that a test wants to win.
void before_call(call which, unsigned nth, std::function<void()> action);

// Whether a failure that was asked for has happened.
bool failed_as_asked(call which);

// The largest iovcnt that a writev has had since the last reset.
int longest_writev();

// Forgets all counts and all plans. Every test that uses this header ends with it; the guard does it.
void reset_calls();

struct fault_scope {
    fault_scope() { reset_calls(); }
    ~fault_scope() { reset_calls(); }
    fault_scope(const fault_scope &)             = delete;
    fault_scope & operator=(const fault_scope &) = delete;
};

} // namespace kt_test
