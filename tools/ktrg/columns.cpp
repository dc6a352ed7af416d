// SPDX-License-Identifier: MIT
// columns: the text form of columns and types.
#include "columns.h"

#include <algorithm>
#include <array>

#include <fmt/format.h>

#include "failure.h"

namespace ktrg
{

namespace
{

struct named_type {
    std::string_view name;
    kt_data_type_t   type;
};

// The first name of a type is the one that is printed; the others are taken too.
constexpr std::array scalar_types = {
    named_type{"int32", KT_INT32},     named_type{"uint32", KT_UINT32},     named_type{"int64", KT_INT64},
    named_type{"uint64", KT_UINT64},   named_type{"float32", KT_FLOAT32},   named_type{"float64", KT_FLOAT64},
    named_type{"string", KT_CHAR_PTR}, named_type{"binary", KT_BINARY_PTR}, named_type{"handle", KT_RSRC_HANDLE_PTR},
    named_type{"sbs", KT_SBS_PTR},     named_type{"int", KT_INT64},         named_type{"uint", KT_UINT64},
    named_type{"float", KT_FLOAT64},   named_type{"double", KT_FLOAT64},    named_type{"text", KT_CHAR_PTR},
    named_type{"str", KT_CHAR_PTR},    named_type{"bytes", KT_BINARY_PTR},
};

struct array_of {
    kt_data_type_t element;
    kt_data_type_t array;
};

constexpr std::array array_types = {
    array_of{KT_INT32, KT_INT32_ARRAY},
    array_of{KT_UINT32, KT_UINT32_ARRAY},
    array_of{KT_INT64, KT_INT64_ARRAY},
    array_of{KT_UINT64, KT_UINT64_ARRAY},
    array_of{KT_FLOAT32, KT_FLOAT32_ARRAY},
    array_of{KT_FLOAT64, KT_FLOAT64_ARRAY},
    array_of{KT_CHAR_PTR, KT_CHAR_PTR_ARRAY},
    array_of{KT_BINARY_PTR, KT_BINARY_PTR_ARRAY},
    array_of{KT_RSRC_HANDLE_PTR, KT_RSRC_HANDLE_PTR_ARRAY},
    array_of{KT_SD_PTR, KT_SD_PTR_ARRAY},
};

struct flag {
    std::string_view name;
    rg_qualifier_t   bits;
};

constexpr std::array modifiers = {
    flag{"protected", RG_PROTECTED},
    flag{"invisible", RG_INVISIBLE},
    flag{"reset", RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED},
};

[[noreturn]] void refuse(std::string text)
{
    throw failure(exit_code::usage, "", std::move(text), RG_E_INVALID_COLUMN);
}

std::vector<std::string> type_words()
{
    std::vector<std::string> words;
    for (const named_type & known : scalar_types)
        words.emplace_back(known.name);
    words.emplace_back("struct");
    return words;
}

// Splits at a character that stands outside parentheses, brackets and braces.
std::vector<std::string_view> split_outside(std::string_view text, char separator)
{
    std::vector<std::string_view> parts;
    std::size_t                   start = 0;
    int                           depth = 0;
    for (std::size_t i = 0; i <= text.size(); i++) {
        if (i == text.size() || (text[i] == separator && depth == 0)) {
            parts.push_back(text.substr(start, i - start));
            start = i + 1;
        } else if (text[i] == '(' || text[i] == '[' || text[i] == '{') {
            depth++;
        } else if (text[i] == ')' || text[i] == ']' || text[i] == '}') {
            depth--;
        }
    }
    return parts;
}

std::vector<column_field> parse_fields(std::string_view text)
{
    std::vector<column_field> fields;
    for (const std::string_view part : split_outside(text, ',')) {
        const std::size_t colon = part.find(':');
        if (colon == std::string_view::npos || colon == 0)
            refuse(fmt::format("a field of a struct is name:type, not {}", in_quotes(part)));
        fields.push_back({std::string(part.substr(0, colon)), parse_type(part.substr(colon + 1), nullptr)});
    }
    return fields;
}

} // namespace

kt_data_type_t element_type(kt_data_type_t array_type)
{
    for (const array_of & known : array_types)
        if (known.array == array_type)
            return known.element;
    return KT_UNKNOWN;
}

std::string type_name(kt_data_type_t type, const std::vector<column_field> & fields)
{
    if (is_array(type))
        return type_name(element_type(type), fields) + "[]";
    if (type == KT_SD_PTR) {
        if (fields.empty())
            return "struct";
        std::string text = "struct(";
        for (const column_field & field : fields)
            text += fmt::format("{}{}:{}", &field == &fields.front() ? "" : ",", field.name, type_name(field.type));
        return text + ")";
    }
    for (const named_type & known : scalar_types)
        if (known.type == type)
            return std::string(known.name);
    return fmt::format("type{}", type);
}

kt_data_type_t parse_type(std::string_view text, std::vector<column_field> * p_fields)
{
    if (text.ends_with("[]")) {
        const kt_data_type_t element = parse_type(text.substr(0, text.size() - 2), p_fields);
        for (const array_of & known : array_types)
            if (known.element == element)
                return known.array;
        refuse(fmt::format("there are no arrays of {}", in_quotes(text.substr(0, text.size() - 2))));
    }
    if (text == "struct" && p_fields == nullptr)
        return KT_SD_PTR;
    if (text.starts_with("struct(") && text.ends_with(")") && p_fields != nullptr) {
        *p_fields = parse_fields(text.substr(7, text.size() - 8));
        return KT_SD_PTR;
    }
    for (const named_type & known : scalar_types)
        if (known.name == text)
            return known.type;
    if (text == "struct")
        refuse("a struct needs its fields, as in struct(street:string,number:int32)");
    refuse(fmt::format("no type {}{}; types are int32 uint32 int64 uint64 float32 float64 string binary handle sbs "
                       "struct(...), and [] behind one for an array",
                       in_quotes(text), did_you_mean(text, type_words())));
}

std::vector<std::string> flag_names(const column & of)
{
    std::vector<std::string> names;
    if ((of.qualifier & 15) == RG_PRIMARY_KEY)
        names.emplace_back("key");
    if ((of.qualifier & 15) == RG_PRIMARY_KEY_NOCHECK)
        names.emplace_back("multikey");
    for (const flag & modifier : modifiers)
        if ((of.qualifier & modifier.bits) != 0)
            names.emplace_back(modifier.name);
    return names;
}

std::string column_text(const column & of)
{
    std::string text = of.name + ":" + type_name(of.type, of.fields);
    for (const std::string & name : flag_names(of))
        text += ":" + name;
    if (!of.default_text.empty())
        text += "=" + of.default_text;
    return text;
}

column parse_column(std::string_view text)
{
    column            result;
    const std::size_t equals = text.find('=');
    if (equals != std::string_view::npos)
        result.default_text = text.substr(equals + 1);
    const std::vector<std::string_view> parts = split_outside(text.substr(0, equals), ':');
    if (parts.size() < 2)
        refuse(fmt::format("a column is name:type[:flags][=default], not {}", in_quotes(text)));
    result.name = parts[0];
    if (!is_column_name(result.name))
        refuse(fmt::format("no column can have the name {}: a letter, then letters, digits and \"_\", 255 at most",
                           in_quotes(result.name)));
    result.type = parse_type(parts[1], &result.fields);
    for (std::size_t i = 2; i < parts.size(); i++) {
        const auto modifier = std::find_if(modifiers.begin(), modifiers.end(),
                                           [&](const flag & known) { return known.name == parts[i]; });
        if (parts[i] == "key")
            result.qualifier = (result.qualifier & ~15U) | RG_PRIMARY_KEY;
        else if (parts[i] == "multikey")
            result.qualifier = (result.qualifier & ~15U) | RG_PRIMARY_KEY_NOCHECK;
        else if (modifier != modifiers.end())
            result.qualifier |= modifier->bits;
        else
            refuse(fmt::format("no flag {}{}; flags are key multikey protected invisible reset", in_quotes(parts[i]),
                               did_you_mean(parts[i], {"key", "multikey", "protected", "invisible", "reset"})));
    }
    if (result.is_key() && !can_be_key(result.type))
        refuse(fmt::format("column \"{}\" can't be the key: a key is a number, a string or a handle", result.name));
    return result;
}

std::vector<column> parse_columns(std::string_view text)
{
    std::vector<column> columns;
    for (const std::string_view part : split_outside(text, ','))
        columns.push_back(parse_column(part));
    return columns;
}

bool is_column_name(std::string_view name)
{
    const auto            is_letter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); };
    const auto            is_digit  = [](char c) { return c >= '0' && c <= '9'; };
    constexpr std::size_t longest   = 255;
    return !name.empty() && name.size() <= longest && is_letter(name[0]) &&
           std::all_of(name.begin(), name.end(), [&](char c) { return is_letter(c) || is_digit(c) || c == '_'; });
}

failure protected_column(const column & of, std::string_view table_name, std::string_view context)
{
    return failure(exit_code::not_permitted, std::string(table_name),
                   fmt::format("{}{}column \"{}\" is protected: it can't be updated", context,
                               context.empty() ? "" : ": ", of.name),
                   RG_E_INVALID_COLUMN);
}

std::size_t find_column(const std::vector<column> & columns, std::string_view name, std::string_view table_name)
{
    for (std::size_t i = 0; i < columns.size(); i++)
        if (columns[i].name == name)
            return i;
    throw failure(exit_code::usage, std::string(table_name),
                  fmt::format("no column {}{}", in_quotes(name), did_you_mean(name, column_names(columns))),
                  RG_E_INVALID_COLUMN);
}

std::vector<std::string> column_names(const std::vector<column> & columns)
{
    std::vector<std::string> names;
    names.reserve(columns.size());
    for (const column & each : columns)
        names.push_back(each.name);
    return names;
}

} // namespace ktrg
