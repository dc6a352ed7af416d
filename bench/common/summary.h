// SPDX-License-Identifier: MIT
// summary: what is told of the repetitions of one figure.
#ifndef BENCH_SUMMARY_H
#define BENCH_SUMMARY_H

#include <algorithm>
#include <cstddef>
#include <vector>

namespace bench
{

struct summary {
    double      median;
    double      least;
    double      most;
    std::size_t samples;
};

// Of one value or more.
inline summary summary_of(std::vector<double> values)
{
    std::sort(values.begin(), values.end());
    const std::size_t middle = values.size() / 2;
    const double      median = values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
    return {median, values.front(), values.back(), values.size()};
}

} // namespace bench

#endif
