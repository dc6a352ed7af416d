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

// A ring through all cells in an order without a pattern, one cell to a cache line (Sattolo's shuffle).
std::vector<std::uint64_t> ring_of(std::size_t cells, std::size_t stride)
{
    std::vector<std::uint64_t> ring(cells * stride);
    for (std::size_t i = 0; i < cells; ++i)
        ring[i * stride] = i * stride;
    std::uint64_t state = 88172645463325252u;
    for (std::size_t i = cells - 1; i > 0; --i) {
        state ^= state << 13;
        state ^= state >> 7;
        state ^= state << 17;
        std::swap(ring[i * stride], ring[state % i * stride]);
    }
    return ring;
}

void measure_memory_access(arena & a)
{
    if (!a.wants({"memory_access"}))
        return;
    const std::vector<std::uint64_t> ring = ring_of((256u << 20) / 64, 64 / sizeof(std::uint64_t));
    std::uint64_t                    at   = 0;
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition) {
        constexpr int steps   = 200'000;
        const double  seconds = seconds_of(clock_kind::processor, [&] {
            for (int i = 0; i < steps; ++i)
                at = ring[at];
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
