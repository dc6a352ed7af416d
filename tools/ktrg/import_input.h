// SPDX-License-Identifier: MIT
// import_input: the file that import reads: its rows, and which column of the table each of its columns is.
#pragma once

#include <set>
#include <string>
#include <vector>

#include "columns.h"
#include "place.h"
#include "text_rows.h"
#include "verbs.h"

namespace ktrg
{

enum class input_format { csv, tsv, json, jsonl };

struct input {
    std::string              file_name; // "standard input" for "-"
    input_format             format = input_format::csv;
    text_rows                rows;
    std::size_t              first_row = 0; // the one behind the header
    std::vector<std::string> headings;      // of the file's columns, as they stand in it
    std::vector<std::string> names;         // of the table's columns; empty: the file's column is left out

    [[nodiscard]] std::size_t count() const { return rows.size() - first_row; }
    [[nodiscard]] bool        is_json() const { return format == input_format::json || format == input_format::jsonl; }
    // `hosts.csv:7`.
    [[nodiscard]] std::string place_of(std::size_t row) const;
};

[[nodiscard]] input read_input(const common_options & common, const import_options & options, const place & where);

// Many programs quote every cell, so quotes make a difference for strings only.
[[nodiscard]] bool is_missing(const text_cell & cell, kt_data_type_t type, const std::string & null_text);

// The columns of a table for the file: those that --types names, with the others detected; the key comes first.
[[nodiscard]] std::vector<column> new_columns(const common_options & common, const import_options & options,
                                              const place & where, const input & from);

// For each column of the file that isn't left out, its position in the file and the table's column.
struct input_column {
    std::size_t position;
    column      of;
};
[[nodiscard]] std::vector<input_column> input_columns(const place & where, const input & from,
                                                      const std::vector<column> & columns);

} // namespace ktrg
