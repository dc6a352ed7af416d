// SPDX-License-Identifier: MIT
// type_detection: the type of a column that a file of text doesn't name.
#pragma once

#include <string_view>

#include "columns.h"
#include "text_rows.h"

namespace ktrg
{

// Looks at the cells of one column. A column of whole numbers is int64, or uint64 if one needs it; one of numbers is
// float64; anything else is a string. Cells that are missing don't count, and numbers with leading zeros are names: a
// post code keeps its zeros. What stands in quotes in JSON is a string, and an array is one of its elements' type.
class type_detector
{
  public:
    void look_at(std::string_view text);
    void look_at(const text_cell & cell);
    // KT_UNKNOWN: it holds objects, or arrays that have no type.
    [[nodiscard]] kt_data_type_t type() const;

  private:
    void                         look_at_array(std::string_view text);
    [[nodiscard]] kt_data_type_t scalar_type() const;

    bool any_         = false;
    bool all_int64_   = true;
    bool all_uint64_  = true;
    bool all_float64_ = true;
    bool any_digits_  = false; // so that a column of "nan" alone is text
    bool any_scalar_  = false; // beside arrays
    bool any_array_   = false; // then the others tell of the elements
    bool any_string_  = false; // in quotes, in JSON
    bool any_bare_    = false; // not in quotes, in JSON
    bool unknown_     = false;
};

} // namespace ktrg
