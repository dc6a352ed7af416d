// SPDX-License-Identifier: MIT
// talk: see its header. Whether -v was given is a matter of the whole process, so it is kept here.
#include "talk.h"

#include <cstdio>

#include <fmt/format.h>

#include "utf8.h"

namespace ktrg
{

namespace
{

bool Verbose = false;

} // namespace

void say(std::string_view text)
{
    std::fputs(fmt::format("ktrg: {}\n", escaped_for_display(text)).c_str(), stderr);
}

void be_verbose()
{
    Verbose = true;
}

bool verbose()
{
    return Verbose;
}

void tell(std::string_view text)
{
    if (Verbose)
        say(text);
}

std::string counted(std::uint64_t count, std::string_view one, std::string_view many)
{
    return fmt::format("{} {}", count, count == 1 ? one : many);
}

std::string counted(std::uint64_t count, std::string_view one)
{
    return counted(count, one, fmt::format("{}s", one));
}

std::string stopwatch::text() const
{
    const std::chrono::duration<double, std::milli> passed = std::chrono::steady_clock::now() - started_;
    return fmt::format("{:.1f} ms", passed.count());
}

} // namespace ktrg
