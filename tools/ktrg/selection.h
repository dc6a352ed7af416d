// SPDX-License-Identifier: MIT
// selection: the expression that a user gives to select and rm, checked ahead of its use and made ready for the
// library.
#pragma once

#include <string>
#include <vector>

#include "columns.h"

namespace ktrg
{

// Throws a usage failure with what is wrong and, in its detail, the expression with a caret under the place.
void check_expression(const std::string & expression, const std::vector<column> & columns,
                      const std::string & table_name);

// The expression as selection criteria. There a "$" begins a variable, so each one that stands inside a string is
// written as an escape; the meaning stays.
[[nodiscard]] std::string criteria_for(const std::string & expression);

} // namespace ktrg
