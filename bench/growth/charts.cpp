// SPDX-License-Identifier: MIT
// charts: a few curves of each family, the state of the table as the dashes of their lines.
#include <filesystem>

#include <fmt/format.h>

#include "common/chart.h"
#include "common/text.h"
#include "report.h"

namespace growth
{

namespace
{

struct picture {
    const char *                  file;
    const char *                  title;
    const char *                  subtitle;
    std::vector<std::string_view> curves;
    bool                          in_pairs = false; // beside the syncs of the moment, not in time
};

// All of them stand out from white and from black.
constexpr const char * colors[] = {"#e4572e", "#3b82c4", "#2a9d5c", "#9b5de5", "#b8860b", "#d6409f", "#17a2a2"};
constexpr const char * limit    = "#8a8f98";

const std::vector<picture> & pictures()
{
    static const std::vector<picture> all{
        {"reads",
         "One row read",
         "per call; solid: a fresh table, dashed: churned",
         {"get_field_by_key", "get_fields_by_key", "get_field_by_index", "get_field_by_fixed_index",
          "get_fixed_row_index_for_key", "get_duplicate_rows", "get_field_by_key, no hash", "memory access"}},
        {"changes",
         "One row changed, in memory",
         "per row; solid: a fresh table, dashed: churned",
         {"set_field_by_key", "set_fields_by_key", "add_row", "delete_row_by_index", "abort", "get_updated_rows",
          "memory access"}},
        {"commits",
         "Changes committed, in memory",
         "per row or transaction; solid: a fresh table, dashed: churned",
         {"apply", "commit", "commit of adds", "commit of deletes", "set, apply, commit", "add, apply, commit",
          "delete, apply, commit", "memory access"}},
        {"calls",
         "Calls that concern no row",
         "per call; solid: beside a fresh table, dashed: a churned one",
         {"open_table, close_table", "list_tables", "get_table_metadata", "overlay_default_value",
          "set_application_metadata", "get_application_metadata", "move_table_by_name"}},
        {"rows",
         "All rows, in memory",
         "per row of the table; solid: fresh, dashed: churned",
         {"select, all", "select, a hundredth", "get_selected_rows_v", "delete_rows, all", "copy_table_by_handle",
          "delete_table", "memory access"}},
        {"packed",
         "Packed tables",
         "per row of the table; solid: fresh, dashed: churned",
         {"pack_tables", "convert, other order", "unpack_table", "close_tree", "memory access"}},
        {"columns",
         "Columns changed",
         "per row of the table; solid: fresh, dashed: churned, or ten versions in the file",
         {"add_columns", "delete_columns", "change_column_name", "add_columns, file", "delete_columns, file",
          "change_column_name, file", "memory access"}},
        {"files",
         "All rows, with a file",
         "per row; solid: a fresh file, dashed: ten versions of each row in it",
         {"open_table, file", "open_hashed_key_table, file", "close_table, file", "copy_table_by_handle, file",
          "copy_table_by_name, file", "move_table_by_handle, file", "first after opening 10 versions",
          "memory access"}},
        {"transactions",
         "Durable transactions of one row",
         "in fsync pairs right behind them; solid: a fresh file, dashed: ten versions a row, dotted: opened anew",
         {"durable set", "durable add", "durable delete"},
         true},
    };
    return all;
}

const char * dashes_of(state s)
{
    switch (s) {
    case state::fresh:
        return "";
    case state::churned:
    case state::versions:
        return "7 5";
    case state::reopened:
        break;
    }
    return "2 5";
}

// The line of the first state has the label.
void add_lines(const figures & all, const curve & c, const char * p_color, bool in_pairs, chart & to)
{
    bool first = true;
    for (const state s : all.states_of(c.name)) {
        line l{first ? c.name : "", p_color, dashes_of(s), c.in == family::machine ? 1.0 : 2.0, {}};
        for (const std::size_t rows : all.sizes_of(c.name, s))
            l.points.emplace_back(rows, in_pairs ? *all.pairs_of(c.name, s, rows) : all.of(c.name, s, rows)->median);
        first = false;
        to.lines.push_back(std::move(l));
    }
}

chart chart_of(const figures & all, const picture & p)
{
    chart c;
    c.title         = p.title;
    c.subtitle      = p.subtitle;
    c.x_text        = [](double rows) { return with_separators(static_cast<std::size_t>(rows)); };
    const unit in   = p.in_pairs ? unit::times : unit::nanoseconds;
    c.y_text        = [in](double value) { return text_of(value, in, digits::needed); };
    c.figure_text   = [in](double value) { return text_of(value, in); };
    std::size_t pen = 0;
    for (const std::string_view name : p.curves) {
        const curve & one = curve_of(name);
        add_lines(all, one, one.in == family::machine ? limit : colors[pen++ % std::size(colors)], p.in_pairs, c);
    }
    return c;
}

} // namespace

void write_charts(const figures & all, const std::string & directory)
{
    std::filesystem::create_directories(directory);
    for (const picture & p : pictures())
        if (const chart c = chart_of(all, p); !c.lines.empty() && c.lines[0].points.size() > 1)
            write_svg(c, fmt::format("{}/growth_{}.svg", directory, p.file));
}

} // namespace growth
