// SPDX-License-Identifier: MIT
// json_text: values written as JSON straight into a string, so that a million rows need no document in memory.
#pragma once

#include <string>
#include <string_view>

namespace ktrg
{

// Appends the text as a JSON string, with its quotes. Bytes that aren't UTF-8 appear as \xHH, that is as "\\xHH" in the
// JSON text, so that any reader accepts it.
void append_json_string(std::string & result, std::string_view text);

// Appends a number in the fewest digits that read back as the same value, always with a point or an exponent; null for
// what JSON has no number for.
void append_json_number(std::string & result, double value);
void append_json_number(std::string & result, float value);

// The same for a cell, where NaN and the infinities have their names.
[[nodiscard]] std::string number_text(double value);
[[nodiscard]] std::string number_text(float value);

} // namespace ktrg
