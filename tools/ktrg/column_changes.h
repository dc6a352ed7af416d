// SPDX-License-Identifier: MIT
// column_changes: what alter is to do to the columns of a table, worked out and checked before anything is touched.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "columns.h"
#include "verbs.h"

namespace ktrg
{

struct column_changes {
    std::vector<std::string>                         drop;
    std::vector<column>                              defaults; // the columns with their new defaults
    std::vector<std::pair<std::string, std::string>> rename;   // in an order in which no name is taken twice
    std::vector<column>                              add;
    std::vector<column>                              result; // the columns as they will be
};

// The changes that the options name. Throws the failure for what can't be done, with the table's name as its subject.
[[nodiscard]] column_changes changes_for(const alter_options & options, const std::vector<column> & columns,
                                         const std::string & subject);

} // namespace ktrg
