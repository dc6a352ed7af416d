// SPDX-License-Identifier: MIT
// rg_i_duplicate_table: copies and moves whole tables, between memory and files.
//
// Which of the mechanics does the work follows from where source and target are: a table object, which is copied from
// its memory also if it has a file, or a file that nobody in the tree has open; a path under a mount point, or not. The
// mechanics run under the tree's write lock and, where they have a table object, under its read lock.
#pragma once

#include "rg_i_table.h"
#include "rg_i_tree.h"

// The operation. A source is given as a handle, or by its path with a NULL handle.
[[nodiscard]] kt_int32_t rg_i_duplicate_table(rg_opaque_handle_t tree_handle, rg_opaque_handle_t source_table_handle,
                                              kt_char_ptr_t p_source_path, kt_char_ptr_t p_target_path,
                                              kt_int32_t remove_source, kt_int32_t overwrite_target);

// ---- To a file (rg_i_copy_to_file): prepared as the rewrite file of the target, and renamed. Whoever calls holds the
// locks of rg_i_tree_locks. On failure the rewrite file is gone and the target as it was. ----

// Writes what a rewrite of the table would write, with the committed change counter, and pending rows included.
[[nodiscard]] kt_int32_t rg_i_duplicate_table_from_memory_to_persistent(rg_i_table_t * p_table,
                                                                        kt_char_ptr_t  p_absolute_target_path,
                                                                        kt_char_ptr_t  p_absolute_target_rewrite_path);
// Copies all bytes, dead ones included. The source isn't locked.
[[nodiscard]] kt_int32_t
                         rg_i_duplicate_table_from_persistent_to_persistent(kt_char_ptr_t p_absolute_source_path,
                                                                            kt_char_ptr_t p_absolute_target_path,
                                                                            kt_char_ptr_t p_absolute_target_rewrite_path);
[[nodiscard]] kt_int32_t rg_i_rename_persistent_table(kt_char_ptr_t p_absolute_source_path,
                                                      kt_char_ptr_t p_absolute_target_path);

// ---- To memory (rg_i_copy_to_memory): objects that aren't in the tree yet ----

[[nodiscard]] kt_int32_t rg_i_duplicate_table_from_persistent_to_memory(rg_i_tree_t *   p_tree,
                                                                        kt_char_ptr_t   p_absolute_source_path,
                                                                        kt_char_ptr_t   p_absolute_target_path,
                                                                        rg_i_table_t ** p_new_table);
// RG_E_UNCOMMITTED_TABLE if anything is pending or applied.
[[nodiscard]] kt_int32_t rg_i_duplicate_table_from_memory_to_memory(rg_i_table_t *    p_table,
                                                                    const kt_char_t * p_new_name,
                                                                    rg_i_table_t **   p_result_table);
// Gives the table a new name, which it owns from here on. It must have left its tree.
void rg_i_rename_memory_table(rg_i_table_t * p_source_table, kt_char_ptr_t p_new_name);
