// SPDX-License-Identifier: MIT
// output: rows on standard output, in the form that the user asked for.
//
// Every form is a row_writer. What the verbs hand over is cells; how a missing value, a NaN or a byte that isn't UTF-8
// looks is the writer's affair, so all verbs agree.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "values.h"

namespace ktrg
{

enum class output_form { table, line, csv, tsv, json, jsonl, markdown };

struct output_style {
    output_form form   = output_form::table;
    bool        header = true;
    std::string null_text;
    bool        colour         = false;
    std::size_t terminal_width = 0; // 0: not a terminal, nothing is cut
    value_style values;
};

struct output_column {
    std::string name;
    bool        right_aligned = false;
};

// Standard output, or a file that is open for writing, with each failure to write noticed.
class output_sink
{
  public:
    output_sink() : output_sink(1, "standard output") {}
    output_sink(int fd, std::string name) : fd_(fd), name_(std::move(name)) {}
    void write(std::string_view text);
    void flush();

  private:
    int         fd_;
    std::string name_; // for messages
    std::string buffer_;
};

class row_writer
{
  public:
    virtual ~row_writer()                                          = default;
    virtual void begin(const std::vector<output_column> & columns) = 0;
    virtual void row(const std::vector<cell> & cells)              = 0;
    virtual void end()                                             = 0;
};

[[nodiscard]] std::unique_ptr<row_writer> make_row_writer(const output_style & style, output_sink & sink);

// The columns of a table as columns of output.
[[nodiscard]] std::vector<output_column> output_columns(const std::vector<column> & columns);

// Appends the cell as JSON.
void append_json_cell(std::string & result, const cell & from, const output_style & style);

// What the terminal is like, if standard output is one.
[[nodiscard]] std::size_t width_of_terminal();

} // namespace ktrg
