// SPDX-License-Identifier: MIT
// value_parse: text as client values.
//
// A value either is taken whole or is refused with what was expected; nothing is rounded into a type's range. Nested
// values come as JSON, which may not nest deeper than the registry stores.
#include "values.h"

#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "failure.h"

namespace ktrg
{

namespace
{

using json = nlohmann::json;

const char * article(kt_data_type_t type)
{
    return type == KT_INT32 || type == KT_INT64 || type == KT_SBS_PTR ? "an" : "a";
}

[[noreturn]] void refuse(kt_data_type_t type, std::string_view text)
{
    throw failure(exit_code::usage, "",
                  fmt::format("{} is not {} {}", in_quotes(text), article(type), type_name(type)));
}

[[noreturn]] void refuse_json(kt_data_type_t type, const json & value)
{
    refuse(type, value.dump(-1, ' ', false, json::error_handler_t::replace));
}

template <typename number> bool parse_whole(std::string_view text, number & value)
{
    const auto [p_end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    return error == std::errc() && p_end == text.data() + text.size() && !text.empty();
}

template <typename number> number parse_integer(kt_data_type_t type, std::string_view text)
{
    number value = 0;
    if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
        const auto [p_end, error] = std::from_chars(text.data() + 2, text.data() + text.size(), value, 16);
        if (error == std::errc() && p_end == text.data() + text.size() && text[2] != '-')
            return value;
        refuse(type, text);
    }
    if (text.size() > 1 && text[0] == '+' && text[1] != '-')
        text.remove_prefix(1);
    if (!parse_whole(text, value))
        refuse(type, text);
    return value;
}

template <typename number> number parse_real(kt_data_type_t type, std::string_view text)
{
    number value = 0;
    if (text.size() > 1 && text[0] == '+' && text[1] != '-')
        text.remove_prefix(1);
    if (!parse_whole(text, value))
        refuse(type, text);
    return value;
}

int hex_digit(char c)
{
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

std::vector<unsigned char> parse_bytes(kt_data_type_t type, std::string_view text)
{
    std::vector<unsigned char> bytes;
    if (text.empty())
        return bytes;
    if (text.size() < 2 || text[0] != '0' || (text[1] != 'x' && text[1] != 'X') || text.size() % 2 != 0)
        refuse(type, text);
    for (std::size_t i = 2; i < text.size(); i += 2) {
        const int high = hex_digit(text[i]);
        const int low  = hex_digit(text[i + 1]);
        if (high < 0 || low < 0)
            refuse(type, text);
        bytes.push_back(static_cast<unsigned char>(high * 16 + low));
    }
    return bytes;
}

kt_char_ptr_t make_string(std::string_view text, value_arena & arena)
{
    if (text.find('\0') != std::string_view::npos)
        throw failure(exit_code::usage, "", "a string can't hold a zero byte");
    auto * p_text = static_cast<kt_char_ptr_t>(arena.allocate(text.size() + 1));
    std::memcpy(p_text, text.data(), text.size());
    p_text[text.size()] = '\0';
    return p_text;
}

kt_binary_ptr_t make_binary(std::string_view text, value_arena & arena)
{
    const std::vector<unsigned char> bytes = parse_bytes(KT_BINARY_PTR, text);
    auto *                           p_binary =
        static_cast<kt_binary_ptr_t>(arena.allocate(offsetof(kt_binary_t, data) + bytes.size() + sizeof(kt_binary_t)));
    p_binary->length = static_cast<kt_uint32_t>(bytes.size());
    if (!bytes.empty())
        std::memcpy(p_binary->data, bytes.data(), bytes.size());
    return p_binary;
}

kt_sbs_ptr_t make_sbs(std::string_view text, value_arena & arena)
{
    const std::vector<unsigned char> bytes = parse_bytes(KT_SBS_PTR, text);
    auto *                           p_sbs =
        static_cast<kt_sbs_ptr_t>(arena.allocate(offsetof(kt_sbs_t, field1) + bytes.size() + sizeof(kt_sbs_t)));
    p_sbs->length = static_cast<kt_int32_t>(bytes.size());
    if (!bytes.empty())
        std::memcpy(&p_sbs->field1, bytes.data(), bytes.size());
    return p_sbs;
}

// Six words: the two halves of the header, the low one first, and the identity.
kt_resource_handle_ptr_t make_handle(std::string_view text, value_arena & arena)
{
    std::uint32_t    words[6] = {};
    std::string_view rest     = text;
    for (int i = 0; i < 6; i++) {
        const std::size_t      end  = i == 5 ? rest.size() : rest.find(' ');
        const std::string_view word = end == std::string_view::npos ? std::string_view() : rest.substr(0, end);
        const std::uint32_t    most = i < 2 ? 0xFFFF : 0xFFFFFFFF;
        if (word.size() < 3 || word[0] != '0' || (word[1] != 'x' && word[1] != 'X'))
            refuse(KT_RSRC_HANDLE_PTR, text);
        const auto [p_end, error] = std::from_chars(word.data() + 2, word.data() + word.size(), words[i], 16);
        if (error != std::errc() || p_end != word.data() + word.size() || words[i] > most)
            refuse(KT_RSRC_HANDLE_PTR, text);
        rest.remove_prefix(std::min(rest.size(), end + 1));
    }
    auto * p_handle = static_cast<kt_resource_handle_ptr_t>(arena.allocate(sizeof(kt_resource_handle_t)));
    *p_handle       = {words[0] | (words[1] << 16U), {words[2], words[3], words[4], words[5]}};
    return p_handle;
}

kt_value_t value_of_json(kt_data_type_t type, const std::vector<column_field> & fields, const json & from,
                         value_arena & arena);

kt_array_ptr_t make_array(kt_data_type_t type, const std::vector<column_field> & fields, const json & from,
                          value_arena & arena)
{
    if (!from.is_array() || from.size() > std::numeric_limits<kt_uint32_t>::max() / sizeof(kt_value_t))
        refuse_json(type, from);
    auto * p_array = static_cast<kt_array_ptr_t>(
        arena.allocate(offsetof(kt_array_t, elements) + (from.size() + 1) * sizeof(kt_value_t)));
    p_array->element_count = static_cast<kt_uint32_t>(from.size());
    p_array->pad           = 0;
    for (std::size_t i = 0; i < from.size(); i++)
        p_array->elements[i] = value_of_json(element_type(type), fields, from[i], arena);
    return p_array;
}

// A structure has all the fields of its definition, in its order. What the JSON leaves out is empty.
kt_sd_ptr_t make_structure(const std::vector<column_field> & fields, const json & from, value_arena & arena)
{
    if (!from.is_object())
        refuse_json(KT_SD_PTR, from);
    for (const auto & [name, unused] : from.items()) {
        bool known = false;
        for (const column_field & field : fields)
            known = known || field.name == name;
        if (!known)
            throw failure(exit_code::usage, "", fmt::format("the struct has no field {}", in_quotes(name)));
    }
    auto * p_data         = static_cast<kt_sd_ptr_t>(arena.allocate(
                offsetof(kt_structured_data_t, elements) + (fields.size() + 1) * sizeof(kt_structured_data_element_t)));
    p_data->element_count = static_cast<kt_uint32_t>(fields.size());
    p_data->pad           = 0;
    for (std::size_t i = 0; i < fields.size(); i++) {
        const auto found    = from.find(fields[i].name);
        p_data->elements[i] = {fields[i].type, 0, kt_value_t{}};
        if (found != from.end())
            p_data->elements[i].value = value_of_json(fields[i].type, {}, *found, arena);
        else if (is_array(fields[i].type))
            p_data->elements[i].value.ptr_array = make_array(fields[i].type, {}, json::array(), arena);
        else if (is_indirect(fields[i].type) && fields[i].type != KT_SD_PTR)
            p_data->elements[i].value = parse_value(
                fields[i].type, {}, fields[i].type == KT_RSRC_HANDLE_PTR ? "0x0 0x0 0x0 0x0 0x0 0x0" : "", arena);
        else if (fields[i].type == KT_SD_PTR)
            p_data->elements[i].value.ptr_sd = make_structure({}, json::object(), arena);
    }
    return p_data;
}

kt_value_t value_of_json(kt_data_type_t type, const std::vector<column_field> & fields, const json & from,
                         value_arena & arena)
{
    kt_value_t value{};
    if (is_array(type))
        value.ptr_array = make_array(type, fields, from, arena);
    else if (type == KT_SD_PTR)
        value.ptr_sd = make_structure(fields, from, arena);
    else if (from.is_string())
        return parse_value(type, fields, from.get_ref<const std::string &>(), arena);
    else if (is_float(type) && from.is_null())
        return parse_value(type, fields, "nan", arena);
    else if (is_number(type) && from.is_number())
        return parse_value(type, fields, from.dump(), arena);
    else
        refuse_json(type, from);
    return value;
}

json parse_json(kt_data_type_t type, std::string_view text)
{
    // A parser of our own depth limit isn't needed: what nests deeper than the registry stores is refused here, before
    // it is taken apart by recursion.
    constexpr int deepest = 32;
    int           depth   = 0;
    json          result  = json::parse(
                  text,
                  [&depth](int at, json::parse_event_t, json &) {
            depth = std::max(depth, at);
            return at <= deepest;
        },
                  false);
    if (result.is_discarded() || depth > deepest)
        refuse(type, text);
    return result;
}

} // namespace

void * value_arena::allocate(std::size_t size)
{
    const std::size_t units = size / sizeof(std::max_align_t) + 1;
    blocks_.push_back(std::make_unique<std::max_align_t[]>(units));
    return blocks_.back().get();
}

bool parse_int64(std::string_view text, std::int64_t & value)
{
    const std::string_view digits = text.starts_with('-') ? text.substr(1) : text;
    return !(digits.size() > 1 && digits[0] == '0') && parse_whole(text, value);
}

bool parse_uint64(std::string_view text, std::uint64_t & value)
{
    return !(text.size() > 1 && text[0] == '0') && parse_whole(text, value);
}

bool parse_float64(std::string_view text, double & value)
{
    const std::string_view digits       = text.starts_with('-') ? text.substr(1) : text;
    const bool             leading_zero = digits.size() > 1 && digits[0] == '0' && digits[1] >= '0' && digits[1] <= '9';
    return !leading_zero && parse_whole(text, value);
}

kt_value_t parse_value(kt_data_type_t type, const std::vector<column_field> & fields, std::string_view text,
                       value_arena & arena)
{
    kt_value_t value{};
    switch (type) {
    case KT_INT32:
        value.val_int32 = parse_integer<kt_int32_t>(type, text);
        break;
    case KT_UINT32:
        value.val_uint32 = parse_integer<kt_uint32_t>(type, text);
        break;
    case KT_INT64:
        value.val_int64 = parse_integer<kt_int64_t>(type, text);
        break;
    case KT_UINT64:
        value.val_uint64 = parse_integer<kt_uint64_t>(type, text);
        break;
    case KT_FLOAT32:
        value.val_float32 = parse_real<kt_float32_t>(type, text);
        break;
    case KT_FLOAT64:
        value.val_float64 = parse_real<kt_float64_t>(type, text);
        break;
    case KT_CHAR_PTR:
        value.ptr_char = make_string(text, arena);
        break;
    case KT_RSRC_HANDLE_PTR:
        value.ptr_rsrc_handle = make_handle(text, arena);
        break;
    default:
        // In a cell these are JSON; binaries may also stand without its quotes.
        if ((type == KT_BINARY_PTR || type == KT_SBS_PTR) && text.starts_with('"'))
            return value_of_json(type, fields, parse_json(type, text), arena);
        if (type == KT_BINARY_PTR)
            value.ptr_binary = make_binary(text, arena);
        else if (type == KT_SBS_PTR)
            value.ptr_sbs = make_sbs(text, arena);
        else
            return value_of_json(type, fields, parse_json(type, text), arena);
    }
    return value;
}

} // namespace ktrg
