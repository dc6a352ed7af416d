// SPDX-License-Identifier: MIT
#include "memory.h"

#include <cstdio>
#include <filesystem>
#include <fstream>

#include <fmt/format.h>

namespace peers
{

namespace
{

// A line of a file of /proc that has kilobytes behind a name; in bytes.
double bytes_from(const char * p_file, const std::string & name)
{
    std::ifstream file(p_file);
    for (std::string word; file >> word;)
        if (word == name) {
            double kilobytes = 0;
            file >> kilobytes;
            return kilobytes * 1024;
        }
    throw std::runtime_error(fmt::format("{} has no {}", p_file, name));
}

double own_bytes()
{
    return bytes_from("/proc/self/smaps_rollup", "Anonymous:");
}

} // namespace

memory_figures memory_of_child(const char * p_store, const place & where)
{
    const std::string program = std::filesystem::read_symlink("/proc/self/exe").string();
    const std::string command =
        fmt::format("'{}' --memory-of '{}' --dir '{}' --rows {}", program, p_store, where.directory, where.rows);
    FILE * p_output = popen(command.c_str(), "r");
    require(p_output != nullptr, "can't start " + program);
    memory_figures bytes{};
    const int      values = std::fscanf(p_output, "%lf %lf", &bytes.own, &bytes.peak);
    require(pclose(p_output) == 0 && values == 2, fmt::format("{}: measuring the memory failed", p_store));
    return bytes;
}

void be_the_child(const std::string & store, const place & where)
{
    for (const store_kind & kind : store_kinds()) {
        if (kind.name != store)
            continue;
        const double before          = own_bytes();
        const double resident_before = bytes_from("/proc/self/status", "VmRSS:");
        const auto   p_store         = kind.open(where, access::read);
        p_store->read_all();
        fmt::print("{} {}\n", own_bytes() - before, bytes_from("/proc/self/status", "VmHWM:") - resident_before);
    }
}

} // namespace peers
