// SPDX-License-Identifier: MIT
// ktrg select: the rows of a table, or those of them that match; sorted and limited here, since a table has no order.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <optional>

#include <fmt/format.h>

#include "interrupt.h"
#include "place.h"
#include "registry.h"
#include "row_output.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// Which rows: those that match the expression, or all of them, of which no list is made.
class row_source
{
  public:
    row_source(const table & from, const std::optional<std::string> & expression) : from_(from), all_(!expression)
    {
        if (expression.has_value())
            matches_ = from.matching(*expression);
    }
    bool next(row_values & values)
    {
        stop_if_interrupted();
        if (all_)
            return from_.read(position_++, values);
        if (position_ == matches_.size())
            return false;
        from_.read_fixed(matches_[position_++], values);
        return true;
    }
    [[nodiscard]] std::uint64_t count() const { return all_ ? from_.count() : matches_.size(); }

  private:
    const table &            from_;
    bool                     all_;
    std::vector<kt_uint32_t> matches_;
    std::uint64_t            position_ = 0;
};

struct sort_column {
    std::size_t position; // among the columns that are read
    bool        descending;
};

// A row that waits to be put in its place: what it is sorted by, and how it is shown.
struct waiting_row {
    std::vector<cell> keys;
    std::vector<cell> shown;
};

// Numbers by value, with what isn't a number at the end; anything else by its bytes.
int compare(const column & of, const cell & a, const cell & b)
{
    if (is_signed(of.type) || is_unsigned(of.type)) {
        const bool negative_a = a.text.starts_with('-');
        const bool negative_b = b.text.starts_with('-');
        if (negative_a != negative_b)
            return negative_a ? -1 : 1;
        // Digits of the same sign: the longer text is the larger number, or the smaller one below zero.
        int order = 0;
        if (a.text.size() != b.text.size())
            order = a.text.size() < b.text.size() ? -1 : 1;
        else
            order = a.text.compare(b.text);
        return negative_a ? -order : order;
    }
    if (is_float(of.type)) {
        const double x = std::strtod(a.text.c_str(), nullptr);
        const double y = std::strtod(b.text.c_str(), nullptr);
        if (std::isnan(x) || std::isnan(y))
            return static_cast<int>(std::isnan(x)) - static_cast<int>(std::isnan(y));
        return x < y ? -1 : x > y ? 1 : 0;
    }
    return a.text.compare(b.text);
}

std::vector<sort_column> sort_columns(const table & from, const std::vector<std::string> & names,
                                      std::vector<column> & read)
{
    std::vector<sort_column> result;
    for (const std::string & name : names) {
        const bool        descending = name.starts_with('-');
        const std::size_t found = find_column(from.columns(), descending ? name.substr(1) : name, from.where().name);
        result.push_back({read.size(), descending});
        read.push_back(from.columns()[found]);
    }
    return result;
}

void write_sorted(row_source & source, row_values & values, std::size_t shown_columns,
                  const std::vector<sort_column> & order, std::size_t limit, const value_style & style,
                  row_output & rows)
{
    std::vector<waiting_row> waiting;
    while (source.next(values)) {
        std::vector<cell> cells = cells_of(values, style);
        waiting_row       row;
        row.keys.assign(std::make_move_iterator(cells.begin() + static_cast<std::ptrdiff_t>(shown_columns)),
                        std::make_move_iterator(cells.end()));
        cells.resize(shown_columns);
        row.shown = std::move(cells);
        waiting.push_back(std::move(row));
    }
    std::stable_sort(waiting.begin(), waiting.end(), [&](const waiting_row & a, const waiting_row & b) {
        for (std::size_t i = 0; i < order.size(); i++) {
            const int by_this = compare(values.columns()[order[i].position], a.keys[i], b.keys[i]);
            if (by_this != 0)
                return order[i].descending ? by_this > 0 : by_this < 0;
        }
        return false;
    });
    for (const waiting_row & row : waiting) {
        if (rows.count() == limit)
            break;
        rows.write(row.shown);
    }
}

void write_as_they_come(row_source & source, row_values & values, std::size_t limit, row_output & rows)
{
    while (rows.count() < limit && source.next(values))
        rows.write(values);
}

exit_code write_count(const output_style & style, std::uint64_t count)
{
    output_sink sink;
    if (style.form == output_form::table) {
        sink.write(fmt::format("{}\n", count));
    } else {
        const auto writer = make_row_writer(style, sink);
        writer->begin({{"count", true}});
        writer->row({cell::of_number(count)});
        writer->end();
    }
    sink.flush();
    return exit_code::done;
}

} // namespace

exit_code run_select(const common_options & common, const select_options & options)
{
    const place        where  = find_place(options.table);
    const table        opened = table::open_for_reading(where);
    const output_style style  = common.style_or(output_form::table);

    std::vector<column>            shown = chosen_columns(opened, options.columns);
    std::vector<column>            read  = shown;
    const std::vector<sort_column> order = sort_columns(opened, options.sort, read);
    const std::size_t              limit = options.limit.value_or(SIZE_MAX);
    row_source                     source(opened, options.expression);
    if (options.count)
        return write_count(style, std::min<std::uint64_t>(source.count(), limit));

    output_sink sink;
    row_output  rows(style, shown, sink);
    row_values  values(read);
    if (order.empty())
        write_as_they_come(source, values, limit, rows);
    else
        write_sorted(source, values, shown.size(), order, limit, style.values, rows);
    rows.end();
    if (style.form == output_form::table && !common.quiet)
        say(fmt::format("{} {}", rows.count(), rows.count() == 1 ? "row" : "rows"));
    return exit_code::done;
}

} // namespace ktrg
