// SPDX-License-Identifier: MIT
// json_text: JSON escapes and shortest numbers.
#include "json_text.h"

#include <cmath>

#include <fmt/format.h>

#include "utf8.h"

namespace ktrg
{

namespace
{

template <typename number> std::string shortest(number value)
{
    if (std::isnan(value))
        return "nan";
    if (std::isinf(value))
        return value > 0 ? "inf" : "-inf";
    std::string text = fmt::format("{}", value);
    if (text.find_first_of(".e") == std::string::npos)
        text += ".0";
    return text;
}

} // namespace

void append_json_string(std::string & result, std::string_view text)
{
    result += '"';
    while (!text.empty()) {
        const auto        byte   = static_cast<unsigned char>(text[0]);
        const std::size_t length = byte < 0x80 ? 1 : character_length(text);
        if (length == 0) {
            result += fmt::format("\\\\x{:02x}", static_cast<unsigned>(byte));
        } else if (byte == '"' || byte == '\\') {
            result += '\\';
            result += text[0];
        } else if (byte == '\n') {
            result += "\\n";
        } else if (byte == '\t') {
            result += "\\t";
        } else if (byte == '\r') {
            result += "\\r";
        } else if (byte < 0x20 || byte == 0x7f) {
            result += fmt::format("\\u{:04x}", static_cast<unsigned>(byte));
        } else {
            result += text.substr(0, length);
        }
        text.remove_prefix(length == 0 ? 1 : length);
    }
    result += '"';
}

void append_json_number(std::string & result, double value)
{
    result += std::isfinite(value) ? shortest(value) : "null";
}

void append_json_number(std::string & result, float value)
{
    result += std::isfinite(value) ? shortest(value) : "null";
}

std::string number_text(double value)
{
    return shortest(value);
}

std::string number_text(float value)
{
    return shortest(value);
}

} // namespace ktrg
