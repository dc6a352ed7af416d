// SPDX-License-Identifier: MIT
// selection: compiles the expression once by itself, over the table's columns, for the diagnosis that the library's
// calls don't hand on.
#include "selection.h"

#include <charconv>

#include <fmt/format.h>

#include "failure.h"
#include "kt_ku.h"
#include "utf8.h"

namespace ktrg
{

namespace
{

// Answers for the columns what the library's own callback would.
kt_int32_t find_name(void * token, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t parent_id,
                     ku_validate_data_t * p_return_data)
{
    const auto &           columns   = *static_cast<const std::vector<column> *>(token);
    const std::string_view name      = std::string_view(p_name, length);
    constexpr kt_uint32_t  top_level = 0xFFFFFFFF;
    if (parent_id == top_level) {
        for (std::size_t i = 0; i < columns.size(); i++) {
            if (columns[i].name == name) {
                *p_return_data = {columns[i].type, static_cast<kt_uint32_t>(i)};
                return 0;
            }
        }
        return -1;
    }
    if (parent_id >= columns.size())
        return -1;
    const std::vector<column_field> & fields = columns[parent_id].fields;
    for (std::size_t i = 0; i < fields.size(); i++) {
        if (fields[i].name == name) {
            *p_return_data = {fields[i].type, static_cast<kt_uint32_t>(i)};
            return 0;
        }
    }
    return -1;
}

struct diagnosis {
    std::size_t line   = 1;
    std::size_t column = 0; // 0: it names no place
    std::string text;
};

// Takes `word N` and the separator behind it off the text's front.
bool take_number(std::string_view & text, std::string_view word, std::string_view separator, std::size_t & number)
{
    if (!text.starts_with(word))
        return false;
    const std::string_view rest   = text.substr(word.size());
    const auto [p_end, error]     = std::from_chars(rest.data(), rest.data() + rest.size(), number);
    const std::string_view behind = rest.substr(static_cast<std::size_t>(p_end - rest.data()));
    if (error != std::errc() || !behind.starts_with(separator))
        return false;
    text = behind.substr(separator.size());
    return true;
}

diagnosis parse_diagnosis(std::string_view text)
{
    diagnosis result;
    take_number(text, "line ", ", ", result.line);
    take_number(text, "column ", ": ", result.column);
    result.text = text;
    return result;
}

// The line of the expression, and below it a caret at the place. What the terminal would obey is left out of both.
std::string picture(const std::string & expression, const diagnosis & what)
{
    std::string_view line = expression;
    for (std::size_t i = 1; i < what.line && line.find('\n') != std::string_view::npos; i++)
        line.remove_prefix(line.find('\n') + 1);
    line = line.substr(0, line.find('\n'));

    std::string      before;
    std::string_view rest = line;
    for (std::size_t i = 1; i < what.column && !rest.empty(); i++) {
        const std::size_t length = std::max<std::size_t>(1, character_length(rest));
        before += escaped_for_display(rest.substr(0, length));
        rest.remove_prefix(length);
    }
    return fmt::format("  {}\n  {}^\n", escaped_for_display(line), std::string(display_width(before), ' '));
}

// A near column for a name that stands between quotes in the diagnosis.
std::string hint_for(const diagnosis & what, const std::vector<column> & columns)
{
    const std::size_t first = what.text.find('"');
    const std::size_t last  = what.text.rfind('"');
    if (first == std::string::npos || last <= first)
        return {};
    return did_you_mean(what.text.substr(first + 1, last - first - 1), column_names(columns));
}

// The length of the string literal that the text begins with, its quotes included.
std::size_t literal_length(std::string_view text, bool escapes)
{
    const char quote = text[0];
    for (std::size_t i = 1; i < text.size(); i++) {
        if (escapes && text[i] == '\\')
            i++;
        else if (text[i] == quote)
            return i + 1;
    }
    return text.size();
}

// The inside of a literal as the inside of $"...", with no "$" in it.
std::string without_dollars(std::string_view inside, bool escapes)
{
    std::string result;
    for (std::size_t i = 0; i < inside.size(); i++) {
        if (inside[i] == '$') {
            result += "\\x24";
        } else if (escapes && inside[i] == '\\' && i + 1 < inside.size()) {
            result += inside[i++];
            result += inside[i];
        } else {
            if (inside[i] == '"' || inside[i] == '\\')
                result += '\\';
            result += inside[i];
        }
    }
    return result;
}

} // namespace

void check_expression(const std::string & expression, const std::vector<column> & columns,
                      const std::string & table_name)
{
    std::string      text       = expression;
    void *           p_compiled = nullptr;
    auto *           p_columns  = const_cast<std::vector<column> *>(&columns);
    const kt_int32_t code       = ku_comp_expr_1(text.data(), 0, find_name, p_columns, &p_compiled);
    if (code == 0) {
        ku_free_expr_1(p_compiled, 0);
        return;
    }
    if (code == KU_EXPR_E_NO_MEMORY)
        throw failure(exit_code::input_output, table_name, "out of memory", RG_E_NO_MEMORY);
    const diagnosis what    = parse_diagnosis(ku_expr_diagnosis_1());
    const bool      unknown = code == KU_EXPR_E_NO_SUCH_NAME;
    throw failure(exit_code::usage, table_name, what.text + (unknown ? hint_for(what, columns) : std::string()),
                  unknown ? RG_E_INVALID_COLUMN : RG_E_LIBRARY_CALL)
        .with_detail(what.column == 0 ? std::string() : picture(expression, what));
}

std::string criteria_for(const std::string & expression)
{
    std::string      result;
    std::string_view rest = expression;
    while (!rest.empty()) {
        const bool escapes = rest.size() > 1 && rest[0] == '$' && (rest[1] == '"' || rest[1] == '\'');
        if (!escapes && rest[0] != '"' && rest[0] != '\'') {
            result += rest[0];
            rest.remove_prefix(1);
            continue;
        }
        const std::size_t      start   = escapes ? 1 : 0;
        const std::size_t      length  = literal_length(rest.substr(start), escapes);
        const std::string_view literal = rest.substr(start, length);
        if (literal.find('$') == std::string_view::npos)
            result += rest.substr(0, start + length);
        else
            result += "$\"" + without_dollars(literal.substr(1, literal.size() - 2), escapes) + "\"";
        rest.remove_prefix(start + length);
    }
    return result;
}

} // namespace ktrg
