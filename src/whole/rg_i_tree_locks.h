// SPDX-License-Identifier: MIT
// rg_i_tree_locks: the file locks under which whole tables are copied and moved between processes.
//
// The lock file ",Lock" of a directory lets one copy or move into it run at a time; the lock of the target's own file
// waits for a process that has the target open for writing. Always taken in this order. Both are lockf locks: they
// belong to the process, and go when it closes any descriptor of the file.
#pragma once

#include "kt_types.h"

// Locks the directory that holds the file, with the lockf command lock_type. *fd is the open lock file then, and
// closing it releases the lock; on failure *fd is untouched.
[[nodiscard]] kt_int32_t rg_i_lock_tree(const kt_char_t * p_absolute_path, kt_int32_t lock_type, kt_int32_t * fd);

// On entry *p_target_fd is a descriptor of the target if the caller has one, else -1; then the target is opened, and
// made empty if it isn't there. A length of 0 means that there is no target. On failure nothing stays open that wasn't,
// and the outputs are -1, -1 and 0. A target of 2 GiB or more has INT32_MAX as its length.
[[nodiscard]] kt_int32_t rg_i_lock_local_tree_and_target_table_if_it_exists(kt_char_ptr_t p_absolute_target_path,
                                                                            kt_int32_t *  p_target_fd,
                                                                            kt_int32_t *  p_local_tree_lock_fd,
                                                                            kt_int32_t *  p_target_length);
