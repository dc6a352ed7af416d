// SPDX-License-Identifier: MIT
// utf8: over utf8proc, which knows the widths of characters.
//
// Tables may hold any bytes in a string. What isn't UTF-8 is shown as an escape and never ends the output.
#include "utf8.h"

#include <fmt/format.h>
#include <utf8proc.h>

namespace ktrg
{

namespace
{

struct character {
    std::size_t      length = 0; // 0: not valid
    utf8proc_int32_t point  = 0;
};

character first_character(std::string_view text)
{
    character              result;
    const utf8proc_ssize_t taken = utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t *>(text.data()),
                                                    static_cast<utf8proc_ssize_t>(text.size()), &result.point);
    result.length                = taken > 0 && result.point >= 0 ? static_cast<std::size_t>(taken) : 0;
    return result;
}

std::size_t width_of(utf8proc_int32_t point)
{
    const int width = utf8proc_charwidth(point);
    return width > 0 ? static_cast<std::size_t>(width) : 0;
}

void append_escape(std::string & result, unsigned char byte)
{
    result += fmt::format("\\x{:02x}", static_cast<unsigned>(byte));
}

bool is_control(utf8proc_int32_t point)
{
    return point < 0x20 || (point >= 0x7f && point < 0xa0);
}

std::string escaped(std::string_view text, bool controls)
{
    std::string result;
    result.reserve(text.size());
    while (!text.empty()) {
        const character   next   = first_character(text);
        const std::size_t length = next.length == 0 ? 1 : next.length;
        if (next.length == 0) {
            append_escape(result, static_cast<unsigned char>(text[0]));
        } else if (!controls || !is_control(next.point)) {
            result += text.substr(0, length);
        } else if (next.point == '\n') {
            result += "\\n";
        } else if (next.point == '\r') {
            result += "\\r";
        } else if (next.point == '\t') {
            result += "\\t";
        } else {
            for (const char byte : text.substr(0, length))
                append_escape(result, static_cast<unsigned char>(byte));
        }
        text.remove_prefix(length);
    }
    return result;
}

} // namespace

std::size_t character_length(std::string_view text)
{
    return text.empty() ? 0 : first_character(text).length;
}

bool is_utf8(std::string_view text)
{
    while (!text.empty()) {
        const std::size_t length = static_cast<unsigned char>(text[0]) < 0x80 ? 1 : first_character(text).length;
        if (length == 0)
            return false;
        text.remove_prefix(length);
    }
    return true;
}

std::string escaped_bytes(std::string_view text)
{
    return is_utf8(text) ? std::string(text) : escaped(text, false);
}

std::string escaped_for_display(std::string_view text)
{
    return escaped(text, true);
}

std::size_t display_width(std::string_view text)
{
    std::size_t width = 0;
    while (!text.empty()) {
        const character next = first_character(text);
        width += next.length == 0 ? 1 : width_of(next.point);
        text.remove_prefix(next.length == 0 ? 1 : next.length);
    }
    return width;
}

std::string cut_to_width(std::string_view text, std::size_t width)
{
    if (display_width(text) <= width)
        return std::string(text);
    if (width == 0)
        return {};
    std::string result;
    std::size_t used = 0;
    while (!text.empty()) {
        const character   next    = first_character(text);
        const std::size_t columns = next.length == 0 ? 1 : width_of(next.point);
        if (used + columns > width - 1)
            break;
        used += columns;
        result += text.substr(0, next.length == 0 ? 1 : next.length);
        text.remove_prefix(next.length == 0 ? 1 : next.length);
    }
    return result + "\u2026";
}

} // namespace ktrg
