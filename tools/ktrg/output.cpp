// SPDX-License-Identifier: MIT
// output: the forms that write each row as it comes: csv, tsv, json, jsonl, line and markdown.
#include "output.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include "failure.h"
#include "json_text.h"
#include "output_table.h"
#include "utf8.h"

namespace ktrg
{

namespace
{

const std::string & plain_text(const cell & from, const output_style & style)
{
    return from.kind == cell_kind::missing ? style.null_text : from.text;
}

// RFC 4180. A string that is empty stands in quotes, so that it differs from what is missing.
void append_csv(std::string & result, const cell & from, const output_style & style)
{
    const std::string text = escaped_bytes(plain_text(from, style));
    const bool        bare =
        text.find_first_of("\",\r\n") == std::string::npos && !(text.empty() && from.kind == cell_kind::text);
    if (bare) {
        result += text;
        return;
    }
    result += '"';
    for (const char c : text) {
        if (c == '"')
            result += '"';
        result += c;
    }
    result += '"';
}

// One line a row: tabs, line ends and backslashes in a cell appear as \t, \n, \r and \\.
void append_tsv(std::string & result, const cell & from, const output_style & style)
{
    for (const char c : escaped_bytes(plain_text(from, style))) {
        if (c == '\t')
            result += "\\t";
        else if (c == '\n')
            result += "\\n";
        else if (c == '\r')
            result += "\\r";
        else if (c == '\\')
            result += "\\\\";
        else
            result += c;
    }
}

// Cells with a character between them: csv and tsv.
class separated_writer : public row_writer
{
  public:
    separated_writer(const output_style & style, output_sink & sink, bool tabs)
        : style_(style), sink_(sink), tabs_(tabs)
    {
    }
    void begin(const std::vector<output_column> & columns) override
    {
        if (!style_.header)
            return;
        std::vector<cell> names;
        for (const output_column & each : columns)
            names.push_back(cell::of_text(each.name));
        row(names);
    }
    void row(const std::vector<cell> & cells) override
    {
        line_.clear();
        for (const cell & each : cells) {
            if (&each != &cells.front())
                line_ += tabs_ ? '\t' : ',';
            if (tabs_)
                append_tsv(line_, each, style_);
            else
                append_csv(line_, each, style_);
        }
        line_ += tabs_ ? "\n" : "\r\n";
        sink_.write(line_);
    }
    void end() override {}

  private:
    output_style  style_;
    output_sink & sink_;
    bool          tabs_;
    std::string   line_;
};

// An array of objects, or an object a line.
class json_writer : public row_writer
{
  public:
    json_writer(const output_style & style, output_sink & sink, bool lines) : style_(style), sink_(sink), lines_(lines)
    {
    }
    void begin(const std::vector<output_column> & columns) override
    {
        for (const output_column & each : columns) {
            std::string name;
            append_json_string(name, each.name);
            names_.push_back(name + ":");
        }
    }
    void row(const std::vector<cell> & cells) override
    {
        text_ = lines_ ? "{" : rows_ == 0 ? "[\n {" : ",\n {";
        for (std::size_t i = 0; i < cells.size(); i++) {
            if (i != 0)
                text_ += ',';
            text_ += names_[i];
            append_json_cell(text_, cells[i], style_);
        }
        text_ += lines_ ? "}\n" : "}";
        sink_.write(text_);
        rows_++;
    }
    void end() override
    {
        if (!lines_)
            sink_.write(rows_ == 0 ? "[]\n" : "\n]\n");
    }

  private:
    output_style             style_;
    output_sink &            sink_;
    bool                     lines_;
    std::vector<std::string> names_;
    std::string              text_;
    std::size_t              rows_ = 0;
};

// `name = value`, a line each, and an empty line between two rows.
class line_writer : public row_writer
{
  public:
    line_writer(const output_style & style, output_sink & sink) : style_(style), sink_(sink) {}
    void begin(const std::vector<output_column> & columns) override
    {
        std::size_t widest = 0;
        for (const output_column & each : columns)
            widest = std::max(widest, display_width(each.name));
        for (const output_column & each : columns)
            names_.push_back(std::string(widest - display_width(each.name), ' ') + each.name);
    }
    void row(const std::vector<cell> & cells) override
    {
        if (rows_++ != 0)
            sink_.write("\n");
        for (std::size_t i = 0; i < cells.size(); i++) {
            const std::string name = style_.colour ? "\x1b[1m" + names_[i] + "\x1b[0m" : names_[i];
            if (style_.header)
                sink_.write(name + " = ");
            sink_.write(escaped_for_display(plain_text(cells[i], style_)) + "\n");
        }
    }
    void end() override {}

  private:
    output_style             style_;
    output_sink &            sink_;
    std::vector<std::string> names_;
    std::size_t              rows_ = 0;
};

class markdown_writer : public row_writer
{
  public:
    markdown_writer(const output_style & style, output_sink & sink) : style_(style), sink_(sink) {}
    void begin(const std::vector<output_column> & columns) override
    {
        // A table in Markdown has a head, so -H leaves its cells empty.
        std::string head = "|";
        std::string rule = "|";
        for (const output_column & each : columns) {
            head += style_.header ? fmt::format(" {} |", escaped(each.name)) : "  |";
            rule += each.right_aligned ? " ---: |" : " --- |";
        }
        sink_.write(head + "\n" + rule + "\n");
    }
    void row(const std::vector<cell> & cells) override
    {
        std::string text = "|";
        for (const cell & each : cells)
            text += fmt::format(" {} |", escaped(plain_text(each, style_)));
        sink_.write(text + "\n");
    }
    void end() override {}

  private:
    static std::string escaped(const std::string & text)
    {
        std::string result;
        for (const char c : escaped_for_display(text)) {
            if (c == '|' || c == '\\')
                result += '\\';
            result += c;
        }
        return result;
    }

    output_style  style_;
    output_sink & sink_;
};

} // namespace

void append_json_cell(std::string & result, const cell & from, const output_style & style)
{
    switch (from.kind) {
    case cell_kind::missing:
    case cell_kind::not_finite:
        result += "null";
        break;
    case cell_kind::number:
    case cell_kind::json:
        result += from.text;
        break;
    case cell_kind::number64:
        result += style.values.int64_as_string ? "\"" + from.text + "\"" : from.text;
        break;
    case cell_kind::text:
        append_json_string(result, from.text);
        break;
    }
}

void output_sink::write(std::string_view text)
{
    constexpr std::size_t enough = 1U << 16;
    buffer_ += text;
    if (buffer_.size() >= enough)
        flush();
}

void output_sink::flush()
{
    std::string_view rest = buffer_;
    while (!rest.empty()) {
        const ssize_t written = ::write(fd_, rest.data(), rest.size());
        if (written < 0 && errno == EINTR)
            continue;
        if (written < 0)
            throw failure(exit_code::input_output, name_, std::strerror(errno));
        rest.remove_prefix(static_cast<std::size_t>(written));
    }
    buffer_.clear();
}

std::unique_ptr<row_writer> make_row_writer(const output_style & style, output_sink & sink)
{
    switch (style.form) {
    case output_form::table:
        return std::make_unique<table_writer>(style, sink);
    case output_form::line:
        return std::make_unique<line_writer>(style, sink);
    case output_form::csv:
        return std::make_unique<separated_writer>(style, sink, false);
    case output_form::tsv:
        return std::make_unique<separated_writer>(style, sink, true);
    case output_form::json:
        return std::make_unique<json_writer>(style, sink, false);
    case output_form::jsonl:
        return std::make_unique<json_writer>(style, sink, true);
    case output_form::markdown:
        return std::make_unique<markdown_writer>(style, sink);
    }
    return nullptr;
}

std::vector<output_column> output_columns(const std::vector<column> & columns)
{
    std::vector<output_column> result;
    for (const column & each : columns)
        result.push_back({each.name, is_number(each.type)});
    return result;
}

std::size_t width_of_terminal()
{
    if (isatty(STDOUT_FILENO) == 0)
        return 0;
    constexpr std::size_t usual = 80;
    winsize               size{};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0)
        return size.ws_col;
    return usual;
}

} // namespace ktrg
