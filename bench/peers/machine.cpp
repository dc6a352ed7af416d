// SPDX-License-Identifier: MIT
// machine: what the machine itself can do: the limits that no store passes.
#include <pthread.h>

#include <cstdlib>
#include <cstring>
#include <vector>

#include "common/machine.h"
#include "groups.h"

namespace peers
{

namespace
{

constexpr std::size_t ring_bytes = 256 << 20;

void measure_memcpy(arena & a)
{
    constexpr std::size_t bytes = 64 << 20;
    std::vector<char>     from(bytes, 1);
    std::vector<char>     to(bytes, 2);
    const double          seconds = seconds_of(clock_kind::processor, [&] {
        for (int i = 0; i < 4; ++i) {
            std::memcpy(to.data(), from.data(), bytes);
            use(to);
        }
    });
    a.add("memcpy", machine, 4 * static_cast<double>(bytes) / seconds / 1e9);
}

void measure_memory_access(arena & a)
{
    if (!a.wants({"memory_access"}))
        return;
    memory_ring ring(ring_bytes);
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition)
        a.add("memory_access", machine, ring.nanoseconds_a_step(200'000));
}

template <class Action> void measure_pairs(arena & a, const char * p_limit, Action pair)
{
    constexpr int pairs   = 1'000'000;
    const double  seconds = seconds_of(clock_kind::processor, [&] {
        for (int i = 0; i < pairs; ++i)
            pair();
    });
    a.add(p_limit, machine, seconds * 1e9 / pairs);
}

} // namespace

void run_machine_limits(arena & a)
{
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition) {
        measure_memcpy(a);
        static pthread_mutex_t mutex = PTHREAD_MUTEX_INITIALIZER;
        measure_pairs(a, "lock_pair", [] {
            pthread_mutex_lock(&mutex);
            pthread_mutex_unlock(&mutex);
        });
        measure_pairs(a, "malloc_pair", [] {
            void * p_block = std::malloc(48);
            use(p_block);
            std::free(p_block);
        });
    }
    measure_memory_access(a);
}

} // namespace peers
