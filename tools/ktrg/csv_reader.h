// SPDX-License-Identifier: MIT
// csv_reader: a CSV text, taken apart by libcsv, with the line that each record began on.
#pragma once

#include <string>
#include <string_view>

#include "text_rows.h"

namespace ktrg
{

// Throws a usage failure with `subject` that names the file and the line.
[[nodiscard]] text_rows read_csv(std::string_view text, const std::string & subject, const std::string & file_name);

} // namespace ktrg
