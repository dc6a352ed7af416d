// SPDX-License-Identifier: MIT
// rg_i_tree: the object that a caller opens first. It owns its named and unnamed tables, its mount points and its two
// string conversion handles, and closing it destroys them all.
#pragma once

#include <pthread.h>
#include <search.h>

#include "kt_ku.h"
#include "kt_rg.h"
#include "rg_i_read_write_lock.h"

// A directory of the file system at a registry path.
struct rg_i_mount_point_t {
    kt_char_ptr_t p_name;            // the registry path with "/" added; owned
    kt_char_ptr_t p_filesystem_path; // the directory, as the caller wrote it; owned
    kt_uint32_t   block_size;        // always 512; that it isn't 0 is the sign of a persistent path
};

struct rg_i_tree_struct_t {
    void *                 p_tables;         // search tree of the named tables, by p_name; guarded by lock
    void *                 p_unnamed_tables; // search tree of the unnamed tables, by address; guarded by lock
    void *                 p_mount_points;   // search tree of the mount points, by p_name; guarded by lock
    ku_iconv_t *           p_to_table_string_conversion_handle;   // constant after creation
    ku_iconv_t *           p_from_table_string_conversion_handle; // constant after creation
    rg_i_read_write_lock_t lock;
    kt_char_ptr_t *        p_list; // this and the rest: meaningful during a listing only; guarded by lock
    kt_char_ptr_t          p_list_prefix;
    kt_uint32_t            total_list_entries;
    kt_uint32_t            max_list_entries;
    kt_int32_t             list_rc;
};
using rg_i_tree_t = rg_i_tree_struct_t;

static_assert(offsetof(rg_i_mount_point_t, block_size) == 16);
static_assert(offsetof(rg_i_tree_t, lock) == 40);

// ---- Process-wide state (rg_x_open_tree) ----

extern void *          P_Registry_Trees; // search tree of all open trees, by address; guarded by Registry_Trees_Mutex
extern pthread_mutex_t Registry_Trees_Mutex; // a leaf: nothing else is taken under it
extern pthread_mutex_t ForkMutex;            // outermost: makes the updates of a process run one at a time
extern kt_uint32_t     In_Child_Process;     // 1 in any child of a process that had opened a tree
extern pthread_once_t  ForkHandlersAreEstablished;

void ForkChildHandler(void);

[[nodiscard]] kt_int32_t rg_i_close_tree(rg_i_tree_t * p_tree);
[[nodiscard]] kt_int32_t rg_i_get_string_conversion_handles(ku_iconv_t ** p_to_table_string_conversion_handle,
                                                            ku_iconv_t ** p_from_table_string_conversion_handle);

// ---- Search trees of the tsearch family (rg_i_binary_search_tree) ----

int  rg_i_table_compare(const void * p_element1, const void * p_element2);
int  rg_i_mount_point_compare(const void * p_element1, const void * p_element2);
int  rg_i_string_to_mount_point_compare(const void * p_path, const void * p_mount_point);
int  rg_i_string_to_mount_point_delete_compare(const void * p_path, const void * p_mount_point);
int  rg_i_string_to_table_compare(const void * p_path, const void * p_table);
int  rg_i_pointer_compare(const void * p_element1, const void * p_element2);
void rg_i_mount_point_delete_action(const void * p_node, VISIT type, int level);
void rg_i_table_delete_action(const void * p_node, VISIT type, int level);         // rg_i_close_table
void rg_i_unnamed_table_delete_action(const void * p_node, VISIT type, int level); // rg_i_close_table

void rg_i_list_tables_action(const void * p_node, VISIT type, int level); // enters a transient table in p_list

// ---- Registry paths (rg_i_paths) ----

// The mount point that the path lies under; NULL: none. The path's syntax has been checked.
[[nodiscard]] const rg_i_mount_point_t * rg_i_find_mount_point(const rg_i_tree_t * p_tree, const kt_char_t * p_path);
[[nodiscard]] kt_int32_t                 rg_i_check_path_syntax(kt_char_ptr_t p_path);
// The name that p_tables knows: a new allocation if *p_persistent comes back non-zero, else p_registry_path itself.
[[nodiscard]] kt_int32_t rg_i_resolve_path(rg_i_tree_t * p_tree, kt_char_ptr_t p_registry_path,
                                           kt_char_ptr_t * p_absolute_registry_path, kt_uint32_t * p_persistent);
[[nodiscard]] kt_int32_t rg_i_create_all_directories_in_path(kt_char_ptr_t p_path);
