// SPDX-License-Identifier: MIT
#include "report.h"

#include <cstdio>

#include <fmt/os.h>

#include "cells.h"
#include "store.h"
#include "workloads.h"

namespace peers
{

namespace
{

template <class Out> void write_machine(const results & figures, Out out)
{
    for (const workload & limit : machine_limits())
        for (const std::size_t rows : figures.sizes())
            if (const auto figure = figures.of(rows, limit.name, machine))
                out(limit, rows, *figure);
}

} // namespace

void print_table(const results & figures)
{
    const auto stores = figures.stores();
    for (const std::size_t rows : figures.sizes()) {
        fmt::print("\n{:<18}", with_separators(rows) + " rows");
        for (const std::string_view store : stores)
            fmt::print("{:>19}", store);
        fmt::print("\n");
        for (const workload & w : workloads()) {
            if (!figures.has(rows, w.name))
                continue;
            fmt::print("{:<18}", w.name);
            for (const std::string_view store : stores)
                fmt::print("{:>19}", cell_of(figures, rows, w, store));
            if (const auto pairs = pairs_of(figures, rows, w, store_kinds()[0].name))
                fmt::print("   {}: {:.2f} fsync pairs", store_kinds()[0].name, *pairs);
            fmt::print("\n");
        }
    }
    fmt::print("\nthe machine\n");
    write_machine(figures, [](const workload & limit, std::size_t rows, const summary & figure) {
        fmt::print("{:<18}{:>19}   at {} rows\n", limit.name, text_of(figure.median, limit.in), with_separators(rows));
    });
    for (const std::string & note : figures.notes())
        fmt::print("{}\n", note);
}

void write_csv(const results & figures, const std::string & path)
{
    auto       out  = fmt::output_file(path);
    const auto line = [&](std::size_t rows, const workload & w, std::string_view store, const summary & f) {
        static constexpr const char * units[] = {"ns", "B", "times", "GB/s"};
        const auto                    ratio   = ratio_of(figures, rows, w, store);
        out.print("{},{},{},{},{:.4g},{:.4g},{:.4g},{},{}\n", rows, w.name, store, units[static_cast<int>(w.in)],
                  f.median, f.least, f.most, f.samples, ratio ? fmt::format("{:.3f}", *ratio) : "");
    };
    out.print("rows,workload,store,unit,median,least,most,samples,ratio_to_{}\n", store_kinds()[0].name);
    for (const std::size_t rows : figures.sizes())
        for (const workload & w : workloads())
            for (const std::string_view store : figures.stores())
                if (const auto figure = figures.of(rows, w.name, store))
                    line(rows, w, store, *figure);
    write_machine(figures, [&](const workload & limit, std::size_t rows, const summary & figure) {
        line(rows, limit, machine, figure);
    });
}

} // namespace peers
