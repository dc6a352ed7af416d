// SPDX-License-Identifier: MIT
// machine: what the machine itself can do: the limits that no store passes.
#include "machine.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <vector>

namespace peers
{

namespace
{

constexpr ssize_t written = 154; // by an apply of one row: its record and a commit record

// Keeps the compiler from leaving out what nobody looks at.
template <class T> void use(T & value)
{
    asm volatile("" : "+r,m"(value) : : "memory");
}

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

// A ring through 2^22 cells, one to a cache line, in an order that no processor foresees: the numbers of a congruential
// generator that has all of them in its period.
constexpr std::uint64_t cells  = 1u << 22;
constexpr std::size_t   stride = 64 / sizeof(std::uint64_t);

std::vector<std::uint64_t> ring()
{
    std::vector<std::uint64_t> next(cells * stride);
    for (std::uint64_t i = 0; i < cells; ++i)
        next[i * stride] = (i * 6364136223846793005u + 1442695040888963407u) % cells * stride;
    return next;
}

void measure_memory_access(arena & a)
{
    if (!a.wants({"memory_access"}))
        return;
    const std::vector<std::uint64_t> next = ring();
    std::uint64_t                    at   = 0;
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition) {
        constexpr int steps   = 200'000;
        const double  seconds = seconds_of(clock_kind::processor, [&] {
            for (int i = 0; i < steps; ++i)
                at = next[at];
            use(at);
        });
        a.add("memory_access", machine, seconds * 1e9 / steps);
    }
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

fsync_file::fsync_file(const std::string & path)
    : path_(path), fd_(open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0644))
{
    require(fd_ >= 0, "can't open " + path);
    append_pair();
}

fsync_file::~fsync_file()
{
    close(fd_);
    unlink(path_.c_str());
}

void fsync_file::append_pair()
{
    pair(end_, end_);
    end_ += written;
}

void fsync_file::overwrite_pair()
{
    pair(end_ - written, 0);
}

void fsync_file::pair(off_t rows_at, off_t mark_at)
{
    static char record[130];
    static char commit[written - sizeof record];
    const iovec parts[]{{record, sizeof record}, {commit, sizeof commit}};
    require(lseek(fd_, rows_at, SEEK_SET) == rows_at && writev(fd_, parts, 2) == written && fsync(fd_) == 0 &&
                lseek(fd_, mark_at, SEEK_SET) == mark_at && write(fd_, commit, 4) == 4 && fsync(fd_) == 0,
            "can't write " + path_);
}

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
