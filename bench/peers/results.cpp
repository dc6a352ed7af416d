// SPDX-License-Identifier: MIT
#include "results.h"

#include <algorithm>
#include <set>

#include "store.h"

namespace peers
{

namespace
{

double median_of(const std::vector<double> & sorted)
{
    const std::size_t middle = sorted.size() / 2;
    return sorted.size() % 2 == 1 ? sorted[middle] : (sorted[middle - 1] + sorted[middle]) / 2;
}

} // namespace

void results::add(std::size_t rows, std::string_view workload, std::string_view store, double value)
{
    samples_[{rows, std::string(workload), std::string(store)}].push_back(value);
}

void results::note(const std::string & text)
{
    if (std::find(notes_.begin(), notes_.end(), text) == notes_.end())
        notes_.push_back(text);
}

std::optional<summary> results::of(std::size_t rows, std::string_view workload, std::string_view store) const
{
    const auto found = samples_.find({rows, std::string(workload), std::string(store)});
    if (found == samples_.end())
        return std::nullopt;
    std::vector<double> sorted = found->second;
    std::sort(sorted.begin(), sorted.end());
    return summary{median_of(sorted), sorted.front(), sorted.back(), sorted.size()};
}

std::vector<std::size_t> results::sizes() const
{
    std::set<std::size_t> sizes;
    for (const auto & [key, values] : samples_)
        sizes.insert(std::get<0>(key));
    return {sizes.begin(), sizes.end()};
}

bool results::has(std::size_t rows, std::string_view workload) const
{
    return std::any_of(samples_.begin(), samples_.end(), [&](const auto & entry) {
        return std::get<0>(entry.first) == rows && std::get<1>(entry.first) == workload;
    });
}

std::vector<std::string_view> results::stores() const
{
    std::vector<std::string_view> names;
    for (const store_kind & kind : store_kinds())
        if (std::any_of(samples_.begin(), samples_.end(),
                        [&](const auto & entry) { return std::get<2>(entry.first) == kind.name; }))
            names.push_back(kind.name);
    return names;
}

} // namespace peers
