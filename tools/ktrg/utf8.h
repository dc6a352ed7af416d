// SPDX-License-Identifier: MIT
// utf8: text as it is shown: what is valid, how wide it is, and what is shown in place of the rest.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace ktrg
{

// The length in bytes of the character that the text begins with, 0 if it doesn't begin with valid UTF-8.
[[nodiscard]] std::size_t character_length(std::string_view text);

[[nodiscard]] bool is_utf8(std::string_view text);

// The text with every byte that isn't UTF-8 as \xHH; nothing else changes.
[[nodiscard]] std::string escaped_bytes(std::string_view text);

// The same, and control characters as \n, \t, \r or \xHH, so that a cell stays on its line and no terminal obeys it.
[[nodiscard]] std::string escaped_for_display(std::string_view text);

// Columns that valid UTF-8 takes on a terminal.
[[nodiscard]] std::size_t display_width(std::string_view text);

// The longest beginning of the text that isn't wider than `width`, with an ellipsis at its end if something is left
// out.
[[nodiscard]] std::string cut_to_width(std::string_view text, std::size_t width);

} // namespace ktrg
