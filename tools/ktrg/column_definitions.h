// SPDX-License-Identifier: MIT
// column_definitions: columns as the library takes them. Defaults and names live as long as this does.
#pragma once

#include <string>
#include <vector>

#include "columns.h"
#include "values.h"

namespace ktrg
{

class column_definitions
{
  public:
    // Throws a usage failure for a default that doesn't fit its column. `subject` names the table.
    column_definitions(const std::vector<column> & columns, const std::string & subject);

    [[nodiscard]] rg_column_t *       data() { return definitions_.data(); }
    [[nodiscard]] kt_uint32_t         count() const { return static_cast<kt_uint32_t>(definitions_.size()); }
    [[nodiscard]] const rg_column_t & operator[](std::size_t i) const { return definitions_[i]; }

  private:
    rg_sd_def_t * make_fields(const column & of);

    std::vector<column>      columns_; // whose names the definitions point to
    std::vector<rg_column_t> definitions_;
    value_arena              arena_;
};

} // namespace ktrg
