// SPDX-License-Identifier: MIT
// csv_reader: a CSV text, taken apart by libcsv, with the line that each record began on.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace ktrg
{

// All cells of a text, in one string each behind the other: a million rows are no million strings.
class csv_text
{
  public:
    struct csv_cell {
        std::string_view text;
        bool             missing = false; // empty and not in quotes
    };

    // Throws a usage failure with `subject` that names the file and the line.
    static csv_text parse(std::string_view text, char separator, const std::string & subject,
                          const std::string & file_name);

    [[nodiscard]] std::size_t   size() const { return records_.size(); }
    [[nodiscard]] std::size_t   cells_of(std::size_t record) const;
    [[nodiscard]] csv_cell      at(std::size_t record, std::size_t i) const;
    [[nodiscard]] std::uint64_t line_of(std::size_t record) const { return records_[record].line; }

  private:
    friend struct csv_builder;
    struct record {
        std::uint64_t line;
        std::size_t   first_cell;
    };
    std::string              text_;
    std::vector<std::size_t> ends_;    // where each cell ends in the text
    std::vector<bool>        missing_; // a bit for each cell
    std::vector<record>      records_;
};

// The whole of a file, or of standard input for "-".
[[nodiscard]] std::string read_whole(const std::string & file_name, const std::string & subject);

} // namespace ktrg
