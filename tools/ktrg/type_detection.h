// SPDX-License-Identifier: MIT
// type_detection: the type of a column that a file of text doesn't name.
#pragma once

#include <string_view>

#include "columns.h"

namespace ktrg
{

// Looks at the cells of one column. A column of whole numbers is int64, or uint64 if one needs it; one of numbers is
// float64; anything else is a string. Cells that are missing don't count, and numbers with leading zeros are names: a
// post code keeps its zeros.
class type_detector
{
  public:
    void                         look_at(std::string_view text);
    [[nodiscard]] kt_data_type_t type() const;

  private:
    bool any_         = false;
    bool all_int64_   = true;
    bool all_uint64_  = true;
    bool all_float64_ = true;
    bool any_digits_  = false; // so that a column of "nan" alone is text
};

} // namespace ktrg
