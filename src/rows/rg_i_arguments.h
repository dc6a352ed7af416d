// SPDX-License-Identifier: MIT
// rg_i_arguments: the parallel arrays of column names and values that the calls on several fields take.
#pragma once

#include "rg_i_table.h"

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
        if (rg_i_same_name(p_column_names[i], p_name))
            return i;
    return total_values;
}

// Finds the arguments of the columns, which must be asked for in their order, each once. Callers mostly name them in that
// order: the name behind the last one found is looked at first. It can't be the second of two equal names then, since
// those ahead of it belong to other columns. (Where a damaged file gives two columns one name, and the caller names it
// twice, each column gets a value of its own.)
struct rg_i_argument_search_t {
    kt_char_ptr_t * p_column_names;
    kt_uint32_t     total_values;
    kt_uint32_t     in_order = 0; // so many names were found one after the other

    [[nodiscard]] kt_uint32_t find(const kt_char_t * p_name)
    {
        if (in_order < total_values && rg_i_same_name(p_column_names[in_order], p_name))
            return in_order++;
        return rg_i_find_argument(p_column_names, total_values, p_name);
    }
};
