// SPDX-License-Identifier: MIT
// clock: what an action takes, in wall time or in processor time of the calling thread.
#ifndef BENCH_CLOCK_H
#define BENCH_CLOCK_H

#include <ctime>

namespace bench
{

enum class clock_kind { wall, processor };

inline double seconds_now(clock_kind kind)
{
    timespec now;
    clock_gettime(kind == clock_kind::wall ? CLOCK_MONOTONIC : CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

template <class Action> double seconds_of(clock_kind kind, Action action)
{
    const double start = seconds_now(kind);
    action();
    return seconds_now(kind) - start;
}

} // namespace bench

#endif
