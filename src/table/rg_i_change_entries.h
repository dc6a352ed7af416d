// SPDX-License-Identifier: MIT
// rg_i_change_entries: where the entries of a table's change lists come from.
//
// A transaction makes an entry for each row that it changes, and all of them end with it. So they are taken one behind
// the other from chunks that double, and go together.
#pragma once

#include "rg_i_table.h"

// NULL: no memory, nothing changed.
[[nodiscard]] rg_i_change_entry_t * rg_i_take_change_entry(rg_i_table_t * p_table);
// Entries on both lists.
[[nodiscard]] kt_uint32_t rg_i_count_change_entries(const rg_i_table_t * p_table);
// None of the entries may be looked at any more.
void rg_i_free_change_entries(rg_i_table_t * p_table);
