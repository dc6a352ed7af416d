// SPDX-License-Identifier: MIT
// text: figures as a person reads them.
#ifndef BENCH_TEXT_H
#define BENCH_TEXT_H

#include <cstddef>
#include <string>

namespace bench
{

enum class unit { nanoseconds, bytes, times, gigabytes_a_second };

// "412 ns", "1.80 ms", "93 B".
enum class digits { three, needed };
std::string text_of(double value, unit in, digits shown = digits::three);

// "1,000,000"
std::string with_separators(std::size_t number);

} // namespace bench

#endif
