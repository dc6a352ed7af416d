// SPDX-License-Identifier: MIT
// text_rows: the rows of a text file before they have types: what csv_reader and json_reader make, and import takes.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace ktrg
{

// What a cell was in the file, where that says more than its text.
enum class text_kind : std::uint8_t {
    missing, // empty and not in quotes, or null
    plain,   // of CSV: anything
    string,  // of JSON
    number,  // of JSON, or true and false
    nested   // an array or an object, as JSON text
};

struct text_cell {
    text_kind        kind = text_kind::missing;
    std::string_view text;
};

// All cells of a file, in one string each behind the other: a million rows are no million strings.
class text_rows
{
  public:
    // Rows are made from front to back: their cells, then the row. `line` is where the row begins in the file.
    void add_cell(text_kind kind, std::string_view text);
    void end_row(std::uint64_t line);

    [[nodiscard]] std::size_t   size() const { return rows_.size(); }
    [[nodiscard]] std::size_t   cells_of(std::size_t row) const;
    [[nodiscard]] std::uint64_t line_of(std::size_t row) const { return rows_[row].line; }
    // A cell behind the row's last is missing.
    [[nodiscard]] text_cell at(std::size_t row, std::size_t i) const;

  private:
    struct row {
        std::uint64_t line;
        std::size_t   first_cell;
    };
    std::string              text_;
    std::vector<std::size_t> ends_; // where each cell ends in the text
    std::vector<text_kind>   kinds_;
    std::vector<row>         rows_;
    std::size_t              first_cell_ = 0; // of the row under way
};

// The whole of a file, or of standard input for "-".
[[nodiscard]] std::string read_whole(const std::string & file_name, const std::string & subject);

} // namespace ktrg
