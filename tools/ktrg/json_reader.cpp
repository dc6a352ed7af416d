// SPDX-License-Identifier: MIT
// json_reader: takes the events of the JSON parser, so that a million rows need no document in memory.
//
// Numbers keep the digits that the file has, also where no double could. Nested values become JSON text again.
#include "json_reader.h"

#include <algorithm>
#include <unordered_map>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "failure.h"
#include "interrupt.h"
#include "json_text.h"

namespace ktrg
{

namespace
{

using json = nlohmann::json;

// A text to parse that counts its lines as it is read.
class counting_text
{
  public:
    using iterator_category = std::input_iterator_tag;
    using value_type        = char;
    using difference_type   = std::ptrdiff_t;
    using pointer           = const char *;
    using reference         = const char &;

    counting_text(const char * p, std::uint64_t * p_line) : p_(p), p_line_(p_line) {}
    reference       operator*() const { return *p_; }
    counting_text & operator++()
    {
        if (*p_ == '\n')
            ++*p_line_;
        p_++;
        return *this;
    }
    bool operator==(const counting_text & other) const { return p_ == other.p_; }
    bool operator!=(const counting_text & other) const { return p_ != other.p_; }

  private:
    const char *    p_;
    std::uint64_t * p_line_;
};

// The parser's events as rows. Depth 0 is outside of all, or in the array of rows; 1 is in a row; deeper is in a value.
class row_events : public nlohmann::json_sax<json>
{
  public:
    row_events(json_rows & result, const std::string & subject, const std::string & file_name, std::uint64_t & line)
        : result_(result), subject_(subject), file_name_(file_name), line_(line)
    {
    }

    // The next document begins: with lines there are many.
    void next_document() { in_array_ = false; }

    bool null() override { return scalar(text_kind::missing, depth_ > 1 ? "null" : ""); }
    bool boolean(bool value) override { return scalar(text_kind::number, value ? "true" : "false"); }
    bool number_integer(number_integer_t value) override { return scalar(text_kind::number, fmt::format("{}", value)); }
    bool number_unsigned(number_unsigned_t value) override
    {
        return scalar(text_kind::number, fmt::format("{}", value));
    }
    bool number_float(number_float_t, const std::string & digits) override { return scalar(text_kind::number, digits); }
    bool string(std::string & text) override
    {
        if (depth_ <= 1)
            return scalar(text_kind::string, text);
        std::string quoted;
        append_json_string(quoted, text);
        return scalar(text_kind::string, quoted);
    }
    bool binary(binary_t &) override { return false; } // JSON has none

    bool key(std::string & name) override
    {
        if (depth_ > 1) {
            separate();
            append_json_string(nested_, name);
            nested_ += ':';
            after_key_ = true;
        } else {
            column_ = column_of(name);
        }
        return true;
    }
    bool start_object(std::size_t) override
    {
        if (depth_ == 0) {
            stop_if_interrupted();
            row_line_ = line_;
            cells_.clear();
            depth_ = 1;
            return true;
        }
        return open('{');
    }
    bool end_object() override { return depth_ == 1 ? end_row() : close('}'); }
    bool start_array(std::size_t) override
    {
        if (depth_ != 0)
            return open('[');
        if (in_array_)
            refuse("a row is an object, not an array");
        in_array_ = true;
        return true;
    }
    bool end_array() override { return depth_ == 0 || close(']'); }
    bool parse_error(std::size_t, const std::string &, const json::exception & what) override
    {
        // The parser's own text names its classes and counts lines from where it was put.
        std::string_view text = what.what();
        text.remove_prefix(text.find("] ") + 2);
        if (text.starts_with("parse error at "))
            text.remove_prefix(text.find(": ") + 2);
        refuse(fmt::format("not JSON: {}", text));
    }

  private:
    struct row_cell {
        text_kind   kind = text_kind::missing;
        std::string text;
    };

    [[noreturn]] void refuse(std::string_view what) const
    {
        throw failure(exit_code::usage, subject_, fmt::format("{}:{}: {}", file_name_, line_, what));
    }

    std::size_t column_of(const std::string & name)
    {
        const auto [found, is_new] = positions_.try_emplace(name, result_.names.size());
        if (is_new)
            result_.names.push_back(name);
        return found->second;
    }

    row_cell & cell()
    {
        if (cells_.size() <= column_)
            cells_.resize(column_ + 1);
        return cells_[column_];
    }

    bool scalar(text_kind kind, std::string_view text)
    {
        if (depth_ == 0)
            refuse(in_array_ ? "a row is an object" : "no object, and no array of objects");
        if (depth_ > 1) {
            separate();
            nested_ += text;
            return true;
        }
        cell() = {kind, std::string(text)};
        return true;
    }

    // A comma between the values of a nested array or object.
    void separate()
    {
        if (!after_key_ && !nested_.empty() && nested_.back() != '[' && nested_.back() != '{')
            nested_ += ',';
        after_key_ = false;
    }

    bool open(char bracket)
    {
        if (depth_++ == 1)
            nested_.clear();
        else
            separate();
        nested_ += bracket;
        after_key_ = false;
        return true;
    }

    bool close(char bracket)
    {
        nested_ += bracket;
        after_key_ = false;
        if (--depth_ == 1)
            cell() = {text_kind::nested, nested_};
        return true;
    }

    bool end_row()
    {
        for (const row_cell & each : cells_)
            result_.rows.add_cell(each.kind, each.text);
        result_.rows.end_row(row_line_);
        depth_ = 0;
        return true;
    }

    json_rows &                                  result_;
    const std::string &                          subject_;
    const std::string &                          file_name_;
    std::uint64_t &                              line_;
    std::uint64_t                                row_line_ = 1;
    std::size_t                                  depth_    = 0;
    bool                                         in_array_ = false;
    std::size_t                                  column_   = 0; // of the member under way
    std::vector<row_cell>                        cells_;        // of the row under way
    std::string                                  nested_;       // the nested value under way
    bool                                         after_key_ = false;
    std::unordered_map<std::string, std::size_t> positions_;
};

void parse(std::string_view text, row_events & events, std::uint64_t & line)
{
    events.next_document();
    json::sax_parse(counting_text(text.data(), &line), counting_text(text.data() + text.size(), &line), &events);
}

} // namespace

json_rows read_json(std::string_view text, bool lines, const std::string & subject, const std::string & file_name)
{
    json_rows     result;
    std::uint64_t line = 1;
    row_events    events(result, subject, file_name, line);
    if (!lines) {
        parse(text, events, line);
        return result;
    }
    for (std::uint64_t number = 1; !text.empty(); number++) {
        const std::size_t      end  = std::min(text.find('\n'), text.size());
        const std::string_view part = text.substr(0, end);
        line                        = number;
        if (part.find_first_not_of(" \t\r") != std::string_view::npos)
            parse(part, events, line);
        text.remove_prefix(std::min(text.size(), end + 1));
    }
    return result;
}

} // namespace ktrg
