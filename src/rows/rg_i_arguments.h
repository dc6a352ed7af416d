// SPDX-License-Identifier: MIT
// rg_i_arguments: the parallel arrays of column names and values that the calls on several fields take.
#pragma once

#include <cstring>

#include "kt_rg.h"

// Whether an array, a name or a value is NULL. Arrays of no entries are not looked at.
[[nodiscard]] inline bool rg_i_any_argument_is_null(kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                                    kt_uint32_t total_values)
{
    if (total_values == 0)
        return false;
    if (p_column_names == nullptr || p_p_values == nullptr)
        return true;
    for (kt_uint32_t i = 0; i < total_values; ++i)
        if (p_column_names[i] == nullptr || p_p_values[i] == nullptr)
            return true;
    return false;
}

// Position of the first such name, or total_values if it isn't there.
[[nodiscard]] inline kt_uint32_t rg_i_find_argument(kt_char_ptr_t * p_column_names, kt_uint32_t total_values,
                                                    const kt_char_t * p_name)
{
    for (kt_uint32_t i = 0; i < total_values; ++i)
        if (std::strcmp(p_column_names[i], p_name) == 0)
            return i;
    return total_values;
}
