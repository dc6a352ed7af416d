// SPDX-License-Identifier: MIT
#include "report.h"

#include <algorithm>
#include <map>
#include <sstream>

#include <fmt/os.h>
#include <fmt/ranges.h>

#include "common/machine.h"
#include "common/text.h"

namespace growth
{

namespace
{

constexpr family families[] = {family::reads,   family::changes, family::calls,        family::rows,
                               family::columns, family::files,   family::transactions, family::machine};

// What is in a line of a table: each curve, once for each state that it was measured in.
struct line {
    const curve *                  p_curve;
    state                          how;
    std::optional<growth_of_curve> growth;
};

std::vector<line> lines_of(const figures & all, family f)
{
    std::vector<line> lines;
    for (const curve & c : curves())
        if (c.in == f)
            for (const state s : all.states_of(c.name))
                lines.push_back({&c, s, growth_of(all, c, s)});
    return lines;
}

std::string cell_of(const figures & all, const line & l, std::size_t rows)
{
    const auto figure = all.of(l.p_curve->name, l.how, rows);
    if (!figure)
        return "–";
    const auto pairs = all.pairs_of(l.p_curve->name, l.how, rows);
    return pairs ? fmt::format("{} ({:.{}f})", text_of(figure->median, unit::nanoseconds), *pairs, *pairs < 10 ? 1 : 0)
                 : text_of(figure->median, unit::nanoseconds);
}

std::string word_of(const line & l)
{
    return l.growth ? l.growth->word : "–";
}

// Which curves measure a function.
std::map<std::string, std::vector<std::string>> functions()
{
    std::map<std::string, std::vector<std::string>> measured_by;
    for (const curve & c : curves()) {
        std::istringstream stream(c.functions);
        for (std::string function; stream >> function;)
            measured_by[function].push_back(fmt::format("`{}`", c.name));
    }
    return measured_by;
}

void write_family(fmt::ostream & out, const figures & all, family f)
{
    const auto lines = lines_of(all, f);
    if (lines.empty())
        return;
    out.print("\n## {}\n\n| Curve | for each | Table |", title_of(f));
    for (const std::size_t rows : all.sizes())
        out.print(" {} |", with_separators(rows));
    out.print(" Growth | Why |\n|---|---|---|");
    for (std::size_t i = 0; i < all.sizes().size(); ++i)
        out.print("--:|");
    out.print("---|---|\n");
    for (const line & l : lines) {
        out.print("| `{}` | {} | {} |", l.p_curve->name, l.p_curve->per, name_of(l.how));
        for (const std::size_t rows : all.sizes())
            out.print(" {} |", cell_of(all, l, rows));
        out.print(" {} | {} |\n", word_of(l), l.growth ? l.growth->why : "");
    }
}

} // namespace

void print_table(const figures & all)
{
    for (const family f : families) {
        const auto lines = lines_of(all, f);
        if (lines.empty())
            continue;
        fmt::print("\n{:<48}", title_of(f));
        for (const std::size_t rows : all.sizes())
            fmt::print("{:>15}", with_separators(rows));
        fmt::print("  growth\n");
        for (const line & l : lines) {
            fmt::print("{:<36}{:<12}", l.p_curve->name, name_of(l.how));
            for (const std::size_t rows : all.sizes())
                fmt::print("{:>15}", cell_of(all, l, rows));
            fmt::print("  {}{}\n", word_of(l), l.growth && !l.growth->explained ? "  NOT EXPLAINED" : "");
        }
    }
}

void write_csv(const figures & all, const std::string & path)
{
    auto out = fmt::output_file(path);
    out.print("rows,curve,table,for_each,clock,median_ns,least_ns,most_ns,samples,fsync_pairs\n");
    for (const curve & c : curves())
        for (const state s : all.states_of(c.name))
            for (const std::size_t rows : all.sizes_of(c.name, s)) {
                const summary f     = *all.of(c.name, s, rows);
                const auto    pairs = all.pairs_of(c.name, s, rows);
                out.print("{},\"{}\",{},{},{},{:.5g},{:.5g},{:.5g},{},{}\n", rows, c.name, name_of(s), c.per,
                          c.clock == clock_kind::wall ? "wall" : "processor", f.median, f.least, f.most, f.samples,
                          pairs ? fmt::format("{:.3g}", *pairs) : "");
            }
}

void write_markdown(const figures & all, const std::string & path, const std::string & command)
{
    auto out = fmt::output_file(path);
    out.print("# What calls cost as a table grows\n\n");
    out.print(
        "Medians, by number of rows. `flat`: the largest table's figure is within a third of that at 16,000 rows, or "
        "for files within a factor of two; otherwise how many times it is. A call that finds its rows in no cache "
        "takes longer for it: what an access to memory costs was measured in the same run, and the growth is "
        "held against the accesses that the call has to make. In brackets: how many times as long as an `fsync pair` "
        "right "
        "behind it a call took, which its growth goes by. How all of it is measured stands in "
        "[PERFORMANCE](../PERFORMANCE.md).\n\n{}. Made with:\n\n    {}\n",
        machine_text(), command);
    for (const family f : families)
        write_family(out, all, f);
    out.print("\n## The functions\n\n| Function | is measured by |\n|---|---|\n");
    for (const auto & [function, names] : functions())
        out.print("| `{}` | {} |\n", function, fmt::join(names, ", "));
}

} // namespace growth
