// SPDX-License-Identifier: MIT
// schema_output: the columns of a table on standard output: what schema shows, and alter as a dry run.
#pragma once

#include "columns.h"
#include "place.h"
#include "verbs.h"

namespace ktrg
{

// As the text that makes them again, or in the form that the user asked for.
void write_schema(const common_options & common, const place & where, const std::vector<column> & columns);

} // namespace ktrg
