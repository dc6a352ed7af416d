// SPDX-License-Identifier: MIT
// rg_x_repair_tables: removes the stray rewrite files of a list of tables.
//
// Layer: whole, exported. Departs from the standard frames: a forked child may repair, and no update is held up.
// Always holds: a table file repairs itself when it is opened, so that a rewrite file is all a crash can leave behind.
// No table file is touched, and no file is looked into. Locking: the tree's write lock; no file lock. So a rewrite that
// is under way, here or in another process, loses its file and fails at its rename. Failure: the names ahead of the one
// that isn't a path have been handled. A file that can't be removed isn't a failure.
#include <unistd.h>

#include <cstring>

#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_repair_tables 1.0";

[[nodiscard]] kt_int32_t repair_table(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path)
{
    kt_char_ptr_t p_table_name = nullptr;
    kt_uint32_t   block_size   = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&tree, p_registry_path, &p_table_name, &block_size); rc != 0)
        return rc;
    if (block_size == 0)
        return 0; // a table in memory has no file
    const owned_buffer file_path(p_table_name);
    unlink(std::strcat(p_table_name, ".rewrite")); // resolved paths have room for it
    return 0;
}

[[nodiscard]] kt_int32_t repair_tables(rg_opaque_handle_t tree_handle, kt_char_ptr_t * p_table_names,
                                       kt_uint32_t array_count)
{
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    if (array_count == 0)
        return 0; // whatever p_table_names is
    if (p_table_names == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_tree_t &     tree = *static_cast<rg_i_tree_t *>(tree_handle);
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    for (kt_uint32_t i = 0; i < array_count; ++i)
        if (const kt_int32_t rc = repair_table(tree, p_table_names[i]); rc != 0)
            return rc;
    return 0;
}

} // namespace

extern "C" kt_int32_t rg_repair_tables_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t * p_table_names,
                                         kt_uint32_t array_count)
{
    rg_i_trace_entry(entry_id::repair_tables);
    return rg_i_finish_call(entry_id::repair_tables, repair_tables(tree_handle, p_table_names, array_count));
}
