// SPDX-License-Identifier: MIT
// figures: all figures of a run, and what they say about growth.
#ifndef GROWTH_FIGURES_H
#define GROWTH_FIGURES_H

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

#include "common/summary.h"
#include "curves.h"

namespace growth
{

class figures
{
  public:
    void add(std::string_view curve, state s, std::size_t rows, double nanoseconds);
    // How many times as long as the pair of syncs behind it something took.
    void add_pairs(std::string_view curve, state s, std::size_t rows, double times);

    [[nodiscard]] std::optional<summary>   of(std::string_view curve, state s, std::size_t rows) const;
    [[nodiscard]] std::optional<double>    pairs_of(std::string_view curve, state s, std::size_t rows) const;
    [[nodiscard]] std::vector<std::size_t> sizes() const;
    [[nodiscard]] std::vector<std::size_t> sizes_of(std::string_view curve, state s) const;
    [[nodiscard]] std::vector<state>       states_of(std::string_view curve) const;

  private:
    using samples = std::map<std::tuple<std::string, state, std::size_t>, std::vector<double>>;

    samples values_;
    samples pairs_;
};

// How a curve goes between two sizes.
struct growth_of_curve {
    std::size_t from;
    std::size_t to;
    double      factor;
    std::string word; // "flat", or the factor
    std::string why;  // empty if flat
    bool        explained;
};

// From 16,000 rows, or the smallest size above a few thousand that there is, to the largest. None for a single size.
std::optional<growth_of_curve> growth_of(const figures & all, const curve & c, state s);

} // namespace growth

#endif
