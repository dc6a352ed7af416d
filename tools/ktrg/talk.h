// SPDX-License-Identifier: MIT
// talk: what ktrg tells on standard error beside its failures: counts and hints, and with -v what it opens and commits.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace ktrg
{

// Prints a line of talk on standard error: `ktrg: text`.
void say(std::string_view text);

// From now on there is something to tell: -v.
void be_verbose();

[[nodiscard]] bool verbose();

// Says it if -v was given.
void tell(std::string_view text);

// `1 row`, `2 rows`.
[[nodiscard]] std::string counted(std::uint64_t count, std::string_view one, std::string_view many);
// The same with an "s" for several.
[[nodiscard]] std::string counted(std::uint64_t count, std::string_view one);

// Time since it was made, as `0.3 ms`.
class stopwatch
{
  public:
    [[nodiscard]] std::string text() const;

  private:
    std::chrono::steady_clock::time_point started_ = std::chrono::steady_clock::now();
};

} // namespace ktrg
