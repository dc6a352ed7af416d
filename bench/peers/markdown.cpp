// SPDX-License-Identifier: MIT
// markdown: a run's figures for docs/PERFORMANCE.md.
#include <fmt/os.h>

#include "cells.h"
#include "common/machine.h"
#include "report.h"
#include "store.h"
#include "workloads.h"

namespace peers
{

namespace
{

// The store with the best figure; smaller is better but for gains.
std::string_view best_of(const results & figures, std::size_t rows, const workload & w)
{
    std::string_view best;
    double           figure_of_best = 0;
    for (const std::string_view store : figures.stores())
        if (const auto figure = figures.of(rows, w.name, store)) {
            const bool better = w.in == unit::times ? figure->median > figure_of_best : figure->median < figure_of_best;
            if (best.empty() || better) {
                best           = store;
                figure_of_best = figure->median;
            }
        }
    return best;
}

void write_limits(fmt::ostream & out, const results & figures)
{
    out.print("\n### The machine\n\n| Limit |");
    for (const std::size_t rows : figures.sizes())
        out.print(" at {} rows |", with_separators(rows));
    out.print(" What |\n|---|");
    for (std::size_t i = 0; i < figures.sizes().size(); ++i)
        out.print("--:|");
    out.print("---|\n");
    for (const workload & limit : machine_limits()) {
        out.print("| `{}` |", limit.name);
        for (const std::size_t rows : figures.sizes()) {
            const auto figure = figures.of(rows, limit.name, machine);
            out.print(" {} |", figure ? text_of(figure->median, limit.in) : "–");
        }
        out.print(" {} |\n", limit.meaning);
    }
}

void write_size(fmt::ostream & out, const results & figures, std::size_t rows)
{
    const auto stores = figures.stores();
    out.print("\n### {} rows\n\n| Workload |", with_separators(rows));
    for (const std::string_view store : stores)
        out.print(" {} |", store);
    out.print("\n|---|");
    for (std::size_t i = 0; i < stores.size(); ++i)
        out.print("--:|");
    out.print("\n");
    for (const workload & w : workloads()) {
        if (!figures.has(rows, w.name))
            continue;
        const std::string_view best = best_of(figures, rows, w);
        out.print("| `{}` |", w.name);
        for (const std::string_view store : stores) {
            const char * p_mark = store == best ? "**" : "";
            out.print(" {}{}{} |", p_mark, cell_of(figures, rows, w, store), p_mark);
        }
        out.print("\n");
    }
}

void write_pairs(fmt::ostream & out, const results & figures)
{
    for (const workload & w : workloads())
        for (const std::size_t rows : figures.sizes())
            if (const auto pairs = pairs_of(figures, rows, w, store_kinds()[0].name))
                out.print("- `{}` at {} rows takes {:.2f} fsync pairs.\n", w.name, with_separators(rows), *pairs);
}

} // namespace

void write_markdown(const results & figures, const std::string & path)
{
    auto out = fmt::output_file(path);
    out.print("{}. Medians; in brackets, how many times the figure of {}, so that above 1 this library is ahead. The "
              "best of each row is bold.\n",
              machine_text(), store_kinds()[0].name);
    write_limits(out, figures);
    for (const std::size_t rows : figures.sizes())
        write_size(out, figures, rows);
    out.print("\n");
    write_pairs(out, figures);
    for (const std::string & note : figures.notes())
        out.print("- {}.\n", note);
}

} // namespace peers
