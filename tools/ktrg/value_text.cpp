// SPDX-License-Identifier: MIT
// value_text: client values as cells and as JSON.
#include "values.h"

#include <array>
#include <cmath>
#include <cstring>

#include <fmt/format.h>

#include "json_text.h"

namespace ktrg
{

namespace
{

std::string hex_text(const unsigned char * p_bytes, std::size_t count)
{
    constexpr std::string_view digits = "0123456789abcdef";
    std::string                text   = "0x";
    text.reserve(2 + 2 * count);
    for (std::size_t i = 0; i < count; i++) {
        text += digits[p_bytes[i] >> 4U];
        text += digits[p_bytes[i] & 15U];
    }
    return text;
}

std::string base64_text(const unsigned char * p_bytes, std::size_t count)
{
    constexpr std::string_view digits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string                text;
    for (std::size_t i = 0; i < count; i += 3) {
        const std::size_t   left  = count - i;
        const std::uint32_t group = static_cast<std::uint32_t>(p_bytes[i] << 16U) |
                                    static_cast<std::uint32_t>(left > 1 ? p_bytes[i + 1] << 8U : 0) |
                                    static_cast<std::uint32_t>(left > 2 ? p_bytes[i + 2] : 0);
        text += digits[group >> 18U];
        text += digits[(group >> 12U) & 63U];
        text += left > 1 ? digits[(group >> 6U) & 63U] : '=';
        text += left > 2 ? digits[group & 63U] : '=';
    }
    return text;
}

std::string bytes_text(const unsigned char * p_bytes, std::size_t count, bytes_form form)
{
    if (form == bytes_form::hex)
        return hex_text(p_bytes, count);
    if (form == bytes_form::base64)
        return base64_text(p_bytes, count);
    return std::string(reinterpret_cast<const char *>(p_bytes), count);
}

std::string handle_text(const kt_resource_handle_t & handle)
{
    return fmt::format("0x{:04x} 0x{:04x} 0x{:08x} 0x{:08x} 0x{:08x} 0x{:08x}", handle.header & 0xFFFFU,
                       handle.header >> 16U, handle.id.id1, handle.id.id2, handle.id.id3, handle.id.id4);
}

void append_integer(std::string & result, std::string digits, bool as_string)
{
    result += as_string ? "\"" + digits + "\"" : digits;
}

void append_array(std::string & result, kt_data_type_t type, const std::vector<column_field> & fields,
                  const kt_array_t & array, const value_style & style)
{
    result += '[';
    for (kt_uint32_t i = 0; i < array.element_count; i++) {
        if (i != 0)
            result += ',';
        append_json_value(result, element_type(type), fields, array.elements[i], style);
    }
    result += ']';
}

// The fields by their names in the definition. Elements that it has no name for go by their position.
void append_structure(std::string & result, const std::vector<column_field> & fields, const kt_structured_data_t & data,
                      const value_style & style)
{
    result += '{';
    for (kt_uint32_t i = 0; i < data.element_count; i++) {
        if (i != 0)
            result += ',';
        append_json_string(result, i < fields.size() ? fields[i].name : fmt::format("{}", i));
        result += ':';
        append_json_value(result, data.elements[i].data_type, {}, data.elements[i].value, style);
    }
    result += '}';
}

} // namespace

void append_json_value(std::string & result, kt_data_type_t type, const std::vector<column_field> & fields,
                       const kt_value_t & value, const value_style & style)
{
    if (is_indirect(type) && value.ptr_char == nullptr) {
        result += "null";
        return;
    }
    switch (type) {
    case KT_INT32:
        result += fmt::format("{}", value.val_int32);
        break;
    case KT_UINT32:
        result += fmt::format("{}", value.val_uint32);
        break;
    case KT_INT64:
        append_integer(result, fmt::format("{}", value.val_int64), style.int64_as_string);
        break;
    case KT_UINT64:
        append_integer(result, fmt::format("{}", value.val_uint64), style.int64_as_string);
        break;
    case KT_FLOAT32:
        append_json_number(result, value.val_float32);
        break;
    case KT_FLOAT64:
        append_json_number(result, value.val_float64);
        break;
    case KT_CHAR_PTR:
        append_json_string(result, value.ptr_char);
        break;
    case KT_BINARY_PTR:
        append_json_string(result, bytes_text(value.ptr_binary->data, value.ptr_binary->length, style.bytes));
        break;
    case KT_RSRC_HANDLE_PTR:
        append_json_string(result, handle_text(*value.ptr_rsrc_handle));
        break;
    case KT_SBS_PTR: {
        const kt_int32_t length = value.ptr_sbs->length;
        append_json_string(result, bytes_text(reinterpret_cast<const unsigned char *>(&value.ptr_sbs->field1),
                                              length > 0 ? static_cast<std::size_t>(length) : 0, style.bytes));
        break;
    }
    case KT_SD_PTR:
        append_structure(result, fields, *value.ptr_sd, style);
        break;
    default:
        if (is_array(type))
            append_array(result, type, fields, *value.ptr_array, style);
        else
            result += "null";
    }
}

cell cell_of(const column & of, const kt_value_t & value, const value_style & style)
{
    switch (of.type) {
    case KT_INT32:
        return {cell_kind::number, fmt::format("{}", value.val_int32)};
    case KT_UINT32:
        return {cell_kind::number, fmt::format("{}", value.val_uint32)};
    case KT_INT64:
        return {cell_kind::number64, fmt::format("{}", value.val_int64)};
    case KT_UINT64:
        return {cell_kind::number64, fmt::format("{}", value.val_uint64)};
    case KT_FLOAT32:
        return {std::isfinite(value.val_float32) ? cell_kind::number : cell_kind::not_finite,
                number_text(value.val_float32)};
    case KT_FLOAT64:
        return {std::isfinite(value.val_float64) ? cell_kind::number : cell_kind::not_finite,
                number_text(value.val_float64)};
    case KT_CHAR_PTR:
        return {cell_kind::text, value.ptr_char != nullptr ? value.ptr_char : ""};
    case KT_RSRC_HANDLE_PTR:
        return value.ptr_rsrc_handle != nullptr ? cell{cell_kind::text, handle_text(*value.ptr_rsrc_handle)} : cell{};
    default:
        break;
    }
    cell result{cell_kind::json, {}};
    append_json_value(result.text, of.type, of.fields, value, style);
    return result;
}

std::string default_text_of(const column & of, const kt_value_t & value)
{
    if (is_indirect(of.type) && value.ptr_char == nullptr)
        return {};
    const cell text = cell_of(of, value, value_style{});
    // The eight bytes of a direct default beyond its width mean nothing.
    const bool empty_number = is_number(of.type) && (text.text == "0" || text.text == "0.0");
    const bool empty_handle = of.type == KT_RSRC_HANDLE_PTR && text.text.find_first_not_of("0x ") == std::string::npos;
    const bool empty_other  = text.text == "[]" || text.text == "{}" || text.text == "\"0x\"";
    return empty_number || empty_handle || empty_other ? std::string() : text.text;
}

} // namespace ktrg
