// SPDX-License-Identifier: MIT
// output_table: rows in aligned columns, for people.
//
// Columns are as wide as their widest cell. On a terminal the widest ones give way until a row fits, and their cells
// are cut with an ellipsis; in a pipe nothing is cut.
#pragma once

#include "output.h"

namespace ktrg
{

class table_writer : public row_writer
{
  public:
    table_writer(const output_style & style, output_sink & sink) : style_(style), sink_(sink) {}
    void begin(const std::vector<output_column> & columns) override;
    void row(const std::vector<cell> & cells) override;
    void end() override;

  private:
    [[nodiscard]] std::vector<std::size_t> fitted_widths() const;
    void write_line(const std::vector<std::string_view> & cells, const std::vector<std::size_t> & widths);

    output_style               style_;
    output_sink &              sink_;
    std::vector<output_column> columns_;
    std::vector<std::size_t>   widths_;
    std::string                text_;   // all cells, one behind the other
    std::vector<std::size_t>   starts_; // where each cell begins
};

} // namespace ktrg
