// SPDX-License-Identifier: MIT
// cells: single figures as they stand in tables.
#ifndef PEERS_CELLS_H
#define PEERS_CELLS_H

#include <optional>
#include <string>

#include "results.h"
#include "workloads.h"

namespace peers
{

// How many times as much as this library; for figures of which more is better, how many times less.
std::optional<double> ratio_of(const results & figures, std::size_t rows, const workload & w, std::string_view store);

// "412 ns (3.21)": the median, and the ratio if there is one.
std::string cell_of(const results & figures, std::size_t rows, const workload & w, std::string_view store);

// What a transaction of one row costs in fsync pairs; nothing for other workloads.
std::optional<double> pairs_of(const results & figures, std::size_t rows, const workload & w, std::string_view store);

} // namespace peers

#endif
