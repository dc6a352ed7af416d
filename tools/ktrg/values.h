// SPDX-License-Identifier: MIT
// values: between the registry's client values and text: cells, JSON, defaults and keys.
//
// Numbers are decimal. Binaries, byte strings and handles have the form that the selection language takes for them:
// "0x0a1f", and six hexadecimal words for a handle. Arrays and structures are JSON.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "columns.h"
#include "kt_rg.h"

namespace ktrg
{

// What a cell of the output is, which decides how each form of output shows it.
enum class cell_kind : std::uint8_t {
    missing,    // shown as --null says; null in JSON
    number,     // a number in JSON too
    number64,   // the same, and a string in JSON if the user asks for that
    not_finite, // nan, inf, -inf; null in JSON
    text,       // any bytes
    json        // JSON in every form of output
};

struct cell {
    cell_kind   kind = cell_kind::missing;
    std::string text;

    static cell of_text(std::string text) { return {cell_kind::text, std::move(text)}; }
    static cell of_number(std::uint64_t number) { return {cell_kind::number64, std::to_string(number)}; }
};

enum class bytes_form { hex, base64, text };

struct value_style {
    bytes_form bytes           = bytes_form::hex;
    bool       int64_as_string = false; // in JSON
};

// The cell for a value of the column.
[[nodiscard]] cell cell_of(const column & of, const kt_value_t & value, const value_style & style);

// Appends the value as JSON.
void append_json_value(std::string & result, kt_data_type_t type, const std::vector<column_field> & fields,
                       const kt_value_t & value, const value_style & style);

// The text form of a default, empty for the type's empty value.
[[nodiscard]] std::string default_text_of(const column & of, const kt_value_t & value);

// Where values live that are made from text. They are valid until the next clear.
class value_arena
{
  public:
    void * allocate(std::size_t size);
    void   clear() { blocks_.clear(); }

  private:
    std::vector<std::unique_ptr<std::max_align_t[]>> blocks_;
};

// The value that the text stands for. Throws a usage failure with no subject, whose text ends in what is wrong, such as
// `"12x" is not an int32`.
[[nodiscard]] kt_value_t parse_value(kt_data_type_t type, const std::vector<column_field> & fields,
                                     std::string_view text, value_arena & arena);

// Whether the whole text is a number of the type, and it if so. Leading zeros, spaces and a '+' are no part of a
// number.
[[nodiscard]] bool parse_int64(std::string_view text, std::int64_t & value);
[[nodiscard]] bool parse_uint64(std::string_view text, std::uint64_t & value);
[[nodiscard]] bool parse_float64(std::string_view text, double & value);

} // namespace ktrg
