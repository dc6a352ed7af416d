// SPDX-License-Identifier: MIT
// row_output: see its header.
#include "row_output.h"

namespace ktrg
{

std::vector<column> chosen_columns(const table & from, const std::vector<std::string> & names)
{
    std::vector<column> chosen;
    if (names.empty()) {
        for (const column & each : from.columns())
            if ((each.qualifier & RG_INVISIBLE) == 0)
                chosen.push_back(each);
        return chosen;
    }
    for (const std::string & name : names)
        chosen.push_back(from.columns()[find_column(from.columns(), name, from.where().name)]);
    return chosen;
}

std::vector<cell> cells_of(const row_values & values, const value_style & style)
{
    std::vector<cell> cells;
    cells.reserve(values.columns().size());
    for (std::size_t i = 0; i < values.columns().size(); i++)
        cells.push_back(cell_of(values.columns()[i], values[i], style));
    return cells;
}

row_output::row_output(const output_style & style, const std::vector<column> & columns, output_sink & sink)
    : style_(style), sink_(sink), writer_(make_row_writer(style, sink))
{
    writer_->begin(output_columns(columns));
}

void row_output::write(const row_values & values)
{
    write(cells_of(values, style_.values));
}

void row_output::write(const std::vector<cell> & cells)
{
    writer_->row(cells);
    count_++;
}

void row_output::end()
{
    writer_->end();
    sink_.flush();
}

} // namespace ktrg
