// SPDX-License-Identifier: MIT
#include "results.h"

#include <algorithm>
#include <set>

#include "store.h"

namespace peers
{

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
    return summary_of(found->second);
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
