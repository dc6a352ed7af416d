// SPDX-License-Identifier: MIT
// tsv_reader: see its header. A backslash in front of anything else is itself.
#include "tsv_reader.h"

#include <algorithm>

namespace ktrg
{

namespace
{

void unescape(std::string_view text, std::string & result)
{
    constexpr std::string_view letters  = "tnr\\";
    constexpr std::string_view meanings = "\t\n\r\\";
    result.clear();
    for (std::size_t i = 0; i < text.size(); i++) {
        const std::size_t escape = text[i] == '\\' && i + 1 < text.size() ? letters.find(text[i + 1]) : letters.npos;
        if (escape == letters.npos) {
            result += text[i];
        } else {
            result += meanings[escape];
            i++;
        }
    }
}

} // namespace

text_rows read_tsv(std::string_view text)
{
    constexpr std::string_view byte_order_mark = "\xef\xbb\xbf";
    if (text.starts_with(byte_order_mark))
        text.remove_prefix(byte_order_mark.size());
    text_rows   result;
    std::string cell;
    for (std::uint64_t line_number = 1; !text.empty(); line_number++) {
        const std::size_t end  = std::min(text.find('\n'), text.size());
        std::string_view  line = text.substr(0, end);
        text.remove_prefix(std::min(text.size(), end + 1));
        if (line.ends_with('\r'))
            line.remove_suffix(1);
        if (line.empty())
            continue;
        for (std::size_t start = 0; start <= line.size();) {
            const std::size_t tab = std::min(line.find('\t', start), line.size());
            unescape(line.substr(start, tab - start), cell);
            result.add_cell(cell.empty() ? text_kind::missing : text_kind::plain, cell);
            start = tab + 1;
        }
        result.end_row(line_number);
    }
    return result;
}

} // namespace ktrg
