// SPDX-License-Identifier: MIT
// results: all figures of a run.
#ifndef PEERS_RESULTS_H
#define PEERS_RESULTS_H

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <vector>

#include "common/summary.h"

namespace peers
{

using namespace bench;

// The name that stands for the machine where a store is named.
constexpr std::string_view machine = "machine";

class results
{
  public:
    void add(std::size_t rows, std::string_view workload, std::string_view store, double value);
    // Why a figure is missing.
    void note(const std::string & text);

    [[nodiscard]] std::optional<summary> of(std::size_t rows, std::string_view workload, std::string_view store) const;
    [[nodiscard]] std::vector<std::size_t> sizes() const;
    [[nodiscard]] bool                     has(std::size_t rows, std::string_view workload) const;
    // Those that have a figure, in the order of the kinds.
    [[nodiscard]] std::vector<std::string_view>    stores() const;
    [[nodiscard]] const std::vector<std::string> & notes() const { return notes_; }

  private:
    std::map<std::tuple<std::size_t, std::string, std::string>, std::vector<double>> samples_;
    std::vector<std::string>                                                         notes_;
};

} // namespace peers

#endif
