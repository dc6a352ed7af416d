// SPDX-License-Identifier: MIT
// charts: what the figures of a workload look like over the sizes.
#include "charts.h"

#include <filesystem>

#include <fmt/format.h>

#include "cells.h"
#include "common/chart.h"
#include "workloads.h"

namespace peers
{

namespace
{

struct pen {
    std::string_view store;
    const char *     p_color;
    const char *     p_dashes;
    double           width;
};

// One hue for each library, dashed for its other configurations; all of them stand out from white and from black.
constexpr pen pens[] = {
    {"kt_rg", "#e4572e", "", 3},
    {"kt_rg-plain", "#e4572e", "6 5", 2},
    {"sqlite-wal", "#3b82c4", "", 1.5},
    {"sqlite-rollback", "#3b82c4", "6 5", 1.5},
    {"sqlite-exclusive", "#3b82c4", "2 5", 1.5},
    {"lmdb", "#2a9d5c", "", 1.5},
    {"leveldb", "#9b5de5", "", 1.5},
    {"tdb", "#b8860b", "", 1.5},
    {machine, "#8a8f98", "2 3", 1.5},
};

const pen & pen_of(std::string_view store)
{
    for (const pen & p : pens)
        if (p.store == store)
            return p;
    return pens[std::size(pens) - 1];
}

// The limit of the machine that a workload can't pass, if one stands for it.
const char * limit_of(std::string_view workload)
{
    if (workload.starts_with("durable_"))
        return "fsync_pair";
    if (workload.starts_with("read_int") || workload.starts_with("name_int"))
        return "memory_access";
    return nullptr;
}

line line_of(const results & figures, const char * p_workload, std::string_view store, const std::string & label)
{
    const pen & p = pen_of(store);
    line        l{label, p.p_color, p.p_dashes, p.width, {}};
    for (const std::size_t rows : figures.sizes())
        if (const auto figure = figures.of(rows, p_workload, store); figure && figure->median > 0)
            l.points.emplace_back(rows, figure->median);
    return l;
}

chart chart_of(const results & figures, const workload & w)
{
    chart c;
    c.title       = w.name;
    c.subtitle    = *w.per != '\0' ? fmt::format("{}; per {}", w.meaning, w.per) : w.meaning;
    c.x_text      = [](double rows) { return with_separators(static_cast<std::size_t>(rows)); };
    c.y_text      = [in = w.in](double value) { return text_of(value, in, digits::needed); };
    c.figure_text = [in = w.in](double value) { return text_of(value, in); };
    for (const std::string_view store : figures.stores())
        if (line l = line_of(figures, w.name, store, std::string(store)); !l.points.empty())
            c.lines.push_back(std::move(l));
    if (const char * p_limit = limit_of(w.name); p_limit != nullptr)
        if (line l = line_of(figures, p_limit, machine, p_limit); !l.points.empty())
            c.lines.push_back(std::move(l));
    return c;
}

} // namespace

void write_charts(const results & figures, const std::string & directory)
{
    std::filesystem::create_directories(directory);
    for (const workload & w : workloads())
        if (const chart c = chart_of(figures, w); !c.lines.empty() && c.lines[0].points.size() > 1)
            write_svg(c, fmt::format("{}/{}.svg", directory, w.name));
}

} // namespace peers
