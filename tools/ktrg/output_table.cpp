// SPDX-License-Identifier: MIT
// output_table: see its header. All rows are kept until the widths are known, in one string.
#include "output_table.h"

#include <algorithm>
#include <numeric>

#include "utf8.h"

namespace ktrg
{

namespace
{

constexpr std::size_t gap = 2; // between two columns

} // namespace

void table_writer::begin(const std::vector<output_column> & columns)
{
    columns_ = columns;
    for (const output_column & each : columns)
        widths_.push_back(style_.header ? display_width(each.name) : 0);
}

void table_writer::row(const std::vector<cell> & cells)
{
    for (std::size_t i = 0; i < cells.size(); i++) {
        const std::string & raw   = cells[i].kind == cell_kind::missing ? style_.null_text : cells[i].text;
        const std::string   shown = escaped_for_display(raw);
        starts_.push_back(text_.size());
        text_ += shown;
        widths_[i] = std::max(widths_[i], display_width(shown));
    }
}

// Takes from the widest column first, as far as the next widest, and never below a width that still says something.
std::vector<std::size_t> table_writer::fitted_widths() const
{
    constexpr std::size_t    least  = 8;
    std::vector<std::size_t> widths = widths_;
    const std::size_t        gaps   = widths.empty() ? 0 : gap * (widths.size() - 1);
    while (style_.terminal_width != 0 && std::accumulate(widths.begin(), widths.end(), gaps) > style_.terminal_width) {
        const auto widest = std::max_element(widths.begin(), widths.end());
        if (*widest <= least)
            break;
        --*widest;
    }
    return widths;
}

void table_writer::write_line(const std::vector<std::string_view> & cells, const std::vector<std::size_t> & widths)
{
    std::string line;
    for (std::size_t i = 0; i < cells.size(); i++) {
        const std::string shown  = cut_to_width(cells[i], widths[i]);
        const std::string filler = std::string(widths[i] - std::min(widths[i], display_width(shown)), ' ');
        line += columns_[i].right_aligned ? filler + shown : shown + filler;
        if (i + 1 < cells.size())
            line += std::string(gap, ' ');
    }
    while (line.ends_with(' '))
        line.pop_back();
    sink_.write(line);
}

void table_writer::end()
{
    const std::vector<std::size_t> widths = fitted_widths();
    if (style_.header) {
        std::vector<std::string_view> names;
        std::vector<std::string>      rules;
        for (std::size_t i = 0; i < columns_.size(); i++) {
            names.emplace_back(columns_[i].name);
            std::string rule;
            for (std::size_t used = 0; used < widths[i]; used++)
                rule += "\u2500";
            rules.push_back(rule);
        }
        sink_.write(style_.colour ? "\x1b[1m" : "");
        write_line(names, widths);
        sink_.write(style_.colour ? "\x1b[0m\n\x1b[2m" : "\n");
        write_line({rules.begin(), rules.end()}, widths);
        sink_.write(style_.colour ? "\x1b[0m\n" : "\n");
    }
    const std::string_view        all = text_;
    std::vector<std::string_view> cells(columns_.size());
    for (std::size_t i = 0; i < starts_.size(); i++) {
        const std::size_t end      = i + 1 < starts_.size() ? starts_[i + 1] : text_.size();
        cells[i % columns_.size()] = all.substr(starts_[i], end - starts_[i]);
        if (i % columns_.size() == columns_.size() - 1) {
            write_line(cells, widths);
            sink_.write("\n");
        }
    }
}

} // namespace ktrg
