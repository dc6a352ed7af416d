// SPDX-License-Identifier: MIT
// rg_i_table_file: the names of a persistent table, and the end of a rewrite file.
#pragma once

#include "rg_i_table.h"

// Gives the table its registry path (NULL is allowed) and the buffer with the two names of its file, which stands at
// the rewrite name then. Failure: RG_E_NO_MEMORY; closing the table frees what it got.
[[nodiscard]] kt_int32_t rg_i_name_table_file(rg_i_table_t * p_table, const kt_char_t * p_registry_path,
                                              const kt_char_t * p_file_name);

// Closes the rewrite file, and with it its lock, and removes it by name. Errors are ignored: without a rewrite file
// nothing happens but that a stale one goes. The path buffer is left at the rewrite name.
void rg_i_give_up_rewrite_file(rg_i_table_t * p_table);
