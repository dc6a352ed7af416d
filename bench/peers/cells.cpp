// SPDX-License-Identifier: MIT
#include "cells.h"

#include <fmt/format.h>

#include "store.h"

namespace peers
{

std::optional<double> ratio_of(const results & figures, std::size_t rows, const workload & w, std::string_view store)
{
    const auto ours   = figures.of(rows, w.name, store_kinds()[0].name);
    const auto theirs = figures.of(rows, w.name, store);
    if (!ours || !theirs || ours->median == 0 || theirs->median == 0 || store == store_kinds()[0].name)
        return std::nullopt;
    return w.in == unit::times ? ours->median / theirs->median : theirs->median / ours->median;
}

std::string cell_of(const results & figures, std::size_t rows, const workload & w, std::string_view store)
{
    const auto figure = figures.of(rows, w.name, store);
    if (!figure)
        return "–";
    const auto ratio = ratio_of(figures, rows, w, store);
    return ratio ? fmt::format("{} ({:.{}f})", text_of(figure->median, w.in), *ratio, *ratio < 10 ? 2 : 0)
                 : text_of(figure->median, w.in);
}

std::optional<double> pairs_of(const results & figures, std::size_t rows, const workload & w, std::string_view store)
{
    const auto figure = figures.of(rows, w.name, store);
    const auto pair   = figures.of(rows, "fsync_pair", machine);
    if (!figure || !pair || !std::string_view(w.name).starts_with("durable_"))
        return std::nullopt;
    return figure->median / pair->median;
}

} // namespace peers
