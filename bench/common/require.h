// SPDX-License-Identifier: MIT
#ifndef BENCH_REQUIRE_H
#define BENCH_REQUIRE_H

#include <stdexcept>
#include <string>

namespace bench
{

inline void require(bool condition, const std::string & what)
{
    if (!condition)
        throw std::runtime_error(what);
}

} // namespace bench

#endif
