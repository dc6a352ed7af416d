// SPDX-License-Identifier: MIT
// machine: what the machine is, and what it can do at best.
#ifndef BENCH_MACHINE_H
#define BENCH_MACHINE_H

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace bench
{

// Keeps the compiler from leaving out what nobody looks at.
template <class T> void use(T & value)
{
    asm volatile("" : "+r,m"(value) : : "memory");
}

// "AMD EPYC, 2 processors, ...": without the machine's name.
std::string machine_text();

// Whether a directory lies in a file system in memory, where syncing costs nothing.
bool lies_in_memory(const std::string & directory);

// A ring through cells of 64 bytes, in an order that no processor foresees.
class memory_ring
{
  public:
    explicit memory_ring(std::size_t bytes); // at least so many: a power of two

    // Nanoseconds that following a pointer from cell to cell takes; the next call goes on where this one ends.
    double nanoseconds_a_step(std::size_t steps);

  private:
    std::vector<std::uint64_t> next_;
    std::uint64_t              at_ = 0;
};

// A file that is synced as a table file is by a transaction of one row. Removed in the end.
class fsync_file
{
  public:
    explicit fsync_file(const std::string & path);
    ~fsync_file();
    fsync_file(const fsync_file &)             = delete;
    fsync_file & operator=(const fsync_file &) = delete;

    // A row's record and a commit record are written behind the end, and synced; then the commit record ahead of them is
    // switched off, and that is synced.
    void append_pair();
    // The same where something has been written before.
    void overwrite_pair();

  private:
    void pair(off_t rows_at, off_t mark_at);

    std::string path_;
    int         fd_;
    off_t       end_ = 0;
};

} // namespace bench

#endif
