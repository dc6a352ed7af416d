// SPDX-License-Identifier: MIT
// rg_i_get_table_metadata: what a table tells about itself, as a record that shares nothing with the table.
#pragma once

#include "rg_i_table.h"

// Which columns' definitions a description of a table holds. Any other number is as visible_columns.
enum : kt_int32_t { RG_I_NO_COLUMNS = 0, RG_I_ALL_COLUMNS = -1, RG_I_VISIBLE_COLUMNS = 1 };

// The caller holds the table's lock. The result goes back through rg_free_table_metadata_1.
[[nodiscard]] kt_int32_t rg_i_get_table_metadata(rg_i_table_t * p_table, kt_int32_t all_metadata,
                                                 rg_table_metadata_t ** p_p_metadata);

// Releases what so many columns in client form own; the array stays with the caller.
void rg_i_free_column_metadata(rg_column_t * p_column, kt_uint32_t total_columns);
