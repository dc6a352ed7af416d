// SPDX-License-Identifier: MIT
// tsv_reader: a text of lines with tabs between their cells, as select and export write it: \t \n \r and \\ in a cell
// stand for a tab, line ends and a backslash, and quotes mean nothing.
#pragma once

#include <string_view>

#include "text_rows.h"

namespace ktrg
{

// Empty lines are passed over, and an empty cell is missing.
[[nodiscard]] text_rows read_tsv(std::string_view text);

} // namespace ktrg
