// SPDX-License-Identifier: MIT
#include "common/machine.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/uio.h>
#include <sys/utsname.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <fstream>

#include <fmt/format.h>

#include "common/clock.h"
#include "common/require.h"

namespace bench
{

namespace
{

constexpr ssize_t written = 154; // by an apply of one row: its record and a commit record

constexpr std::size_t stride = 64 / sizeof(std::uint64_t);

std::string processor_name()
{
    std::ifstream file("/proc/cpuinfo");
    for (std::string text; std::getline(file, text);)
        if (text.starts_with("model name"))
            return text.substr(text.find(": ") + 2);
    return "unknown processor";
}

} // namespace

std::string machine_text()
{
    utsname system;
    uname(&system);
    const double memory =
        static_cast<double>(sysconf(_SC_PHYS_PAGES)) * static_cast<double>(sysconf(_SC_PAGESIZE)) / (1u << 30);
    return fmt::format("{}, {} processors, {:.0f} GiB of memory, Linux {}", processor_name(),
                       sysconf(_SC_NPROCESSORS_ONLN), memory, system.release);
}

bool lies_in_memory(const std::string & directory)
{
    struct statfs status;
    return statfs(directory.c_str(), &status) == 0 && status.f_type == TMPFS_MAGIC;
}

// The order is that of the numbers of a congruential generator that has all of them in its period.
memory_ring::memory_ring(std::size_t bytes)
{
    const std::uint64_t cells = std::bit_ceil(std::max<std::size_t>(bytes / 64, 8));
    next_.resize(cells * stride);
    for (std::uint64_t i = 0; i < cells; ++i)
        next_[i * stride] = (i * 6364136223846793005u + 1442695040888963407u) % cells * stride;
}

double memory_ring::nanoseconds_a_step(std::size_t steps)
{
    const double seconds = seconds_of(clock_kind::processor, [&] {
        for (std::size_t i = 0; i < steps; ++i)
            at_ = next_[at_];
        use(at_);
    });
    return seconds * 1e9 / static_cast<double>(steps);
}

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

} // namespace bench
