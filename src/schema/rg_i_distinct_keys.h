// SPDX-License-Identifier: MIT
// rg_i_distinct_keys: whether a look at all keys together can spare the look at all rows for each of them.
#pragma once

#include "rg_i_table.h"

// True if no two rows that a read of the committed state by packed index delivers have keys that an add without a hash
// table takes for equal. False if there are such rows, or if that can't be told, or isn't worth the while. The caller
// holds the table's lock.
[[nodiscard]] bool rg_i_keys_are_distinct(const rg_i_table_t * p_table);
