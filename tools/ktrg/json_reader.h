// SPDX-License-Identifier: MIT
// json_reader: rows of JSON: an array of objects, one object, or an object a line.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "text_rows.h"

namespace ktrg
{

// The rows, and the names of all objects' members in the order in which they first appear. An object's cells stand in
// that order; a member that it lacks is missing.
struct json_rows {
    std::vector<std::string> names;
    text_rows                rows;
};

// Throws a usage failure with `subject` that names the file and the line. With `lines` each line is an object.
[[nodiscard]] json_rows read_json(std::string_view text, bool lines, const std::string & subject,
                                  const std::string & file_name);

} // namespace ktrg
