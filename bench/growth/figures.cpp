// SPDX-License-Identifier: MIT
#include "figures.h"

#include <algorithm>
#include <set>

#include <fmt/format.h>

namespace growth
{

namespace
{

// Tables of so many rows have outgrown what a call costs by itself, and still lie in the caches.
constexpr std::size_t base_rows = 16'000;

// Factors below which two figures count as one. Disks vary more than memory.
constexpr double same_for_processors = 1.35;
constexpr double same_for_disks      = 2;

// Where the rule that rewrites an opened file goes wrong, and what a row takes in the file.
constexpr std::size_t rewritten_above = 86'000'000;
constexpr std::size_t bytes_of_a_row  = 115;

// The largest size measured that isn't larger.
std::size_t measured_size(const figures & all, std::size_t rows)
{
    std::size_t found = 0;
    for (const std::size_t size : all.sizes_of("memory access", state::fresh))
        if (size <= rows)
            found = size;
    return found;
}

// What following a pointer costs at one size more than at another.
std::optional<double> dearer_access(const figures & all, std::size_t from, std::size_t to)
{
    const auto near = all.of("memory access", state::fresh, from);
    const auto far  = all.of("memory access", state::fresh, to);
    if (!near || !far || far->median <= near->median)
        return std::nullopt;
    return far->median - near->median;
}

} // namespace

void figures::add(std::string_view curve, state s, std::size_t rows, double nanoseconds)
{
    values_[{std::string(curve), s, rows}].push_back(nanoseconds);
}

std::optional<summary> figures::of(std::string_view curve, state s, std::size_t rows) const
{
    const auto found = values_.find({std::string(curve), s, rows});
    if (found == values_.end())
        return std::nullopt;
    return summary_of(found->second);
}

void figures::add_pairs(std::string_view curve, state s, std::size_t rows, double times)
{
    pairs_[{std::string(curve), s, rows}].push_back(times);
}

std::optional<double> figures::pairs_of(std::string_view curve, state s, std::size_t rows) const
{
    const auto found = pairs_.find({std::string(curve), s, rows});
    return found == pairs_.end() ? std::nullopt : std::optional(summary_of(found->second).median);
}

std::vector<std::size_t> figures::sizes() const
{
    std::set<std::size_t> sizes;
    for (const auto & [key, values] : values_)
        sizes.insert(std::get<2>(key));
    return {sizes.begin(), sizes.end()};
}

std::vector<std::size_t> figures::sizes_of(std::string_view curve, state s) const
{
    std::vector<std::size_t> sizes;
    for (const auto & [key, values] : values_)
        if (std::get<0>(key) == curve && std::get<1>(key) == s)
            sizes.push_back(std::get<2>(key));
    return sizes; // ascending, as the keys are
}

std::vector<state> figures::states_of(std::string_view curve) const
{
    std::set<state> states;
    for (const auto & [key, values] : values_)
        if (std::get<0>(key) == curve)
            states.insert(std::get<1>(key));
    return {states.begin(), states.end()};
}

std::optional<growth_of_curve> growth_of(const figures & all, const curve & c, state s)
{
    const std::vector<std::size_t> sizes = all.sizes_of(c.name, s);
    if (sizes.size() < 2)
        return std::nullopt;
    const auto        above = std::find_if(sizes.begin(), sizes.end() - 1, [](auto rows) { return rows >= base_rows; });
    const std::size_t from  = above == sizes.end() - 1 ? sizes.front() : *above;
    const std::size_t to    = sizes.back();
    const double      before       = all.of(c.name, s, from)->median;
    const double      after        = all.of(c.name, s, to)->median;
    const auto        pairs_before = all.pairs_of(c.name, s, from);
    const auto        pairs_after  = all.pairs_of(c.name, s, to);
    const double      same         = c.clock == clock_kind::wall ? same_for_disks : same_for_processors;
    growth_of_curve   g{from, to, pairs_after ? *pairs_after / *pairs_before : after / before, "flat", "", true};
    if (g.factor <= same && (pairs_after || g.factor >= 1 / same))
        return g;

    g.word = fmt::format("×{:.{}f}", g.factor, g.factor < 10 ? 1 : 0);
    if (g.factor < 1) {
        g.why = "what a call costs by itself is shared by more rows";
        return g;
    }
    if (s == state::reopened && to * bytes_of_a_row > rewritten_above) {
        g.why = "an opened file of more than 86 MB is written anew by every transaction";
        return g;
    }
    if (c.defined_growth) {
        g.why = c.why;
        return g;
    }
    if (pairs_after) {
        g.explained = false;
        g.why = fmt::format("**not explained**: {:.1f} fsync pairs instead of {:.1f}", *pairs_after, *pairs_before);
        return g;
    }
    // A file with ten versions of each row holds ten times the rows.
    const std::size_t versions = s == state::versions && c.in == family::files ? 10 : 1;
    const double      most     = static_cast<double>(versions) * c.accesses;
    const auto dearer   = dearer_access(all, measured_size(all, from * versions), measured_size(all, to * versions));
    const auto accesses = dearer ? (after - before) / *dearer : 0;
    g.explained         = dearer && accesses <= most;
    g.why               = fmt::format("{}: as much as {:.1f} accesses to memory cost more, of {:g} or fewer: {}",
                        g.explained ? "caches" : "**not explained**", accesses, most, c.why);
    return g;
}

} // namespace growth
