// SPDX-License-Identifier: MIT
// rg_i_remove_table: takes tables off the disk and out of their trees. No table object is closed here.
#pragma once

#include "rg_i_table.h"
#include "rg_i_tree.h"

// Removes the table's files, if it has any, and if that went well takes it out of its tree. Handles on it stay good as
// pointers, and its descriptor stays open on the removed file.
[[nodiscard]] kt_int32_t rg_i_remove_table(rg_i_table_t * p_table);

// Takes the table out of its tree, whatever has become of its files.
void rg_i_leave_tree(rg_i_table_t * p_table);

// Removes a table file that no table object stands for. Its rewrite file, if there is one, stays.
[[nodiscard]] kt_int32_t rg_i_remove_persistent_table_without_handle(const kt_char_t * p_absolute_table_path);

// Removes a file by its path: RG_E_NO_SUCH_TABLE, RG_E_ACCESS or RG_E_SYSTEM_CALL.
[[nodiscard]] kt_int32_t rg_i_unlink_table_file(const kt_char_t * p_path);

// Closes an object that has left its tree, if no handle on it is left either.
void rg_i_close_if_unused(rg_i_table_t * p_table);
