// SPDX-License-Identifier: MIT
// rg_x_delete_table: deletes a table by its registry path: out of the tree, and off the disk.
//
// Layer: whole, exported.
// Always holds: a table that still has handles lives on outside the tree until they are closed, with its memory and its
// open file. Locking: ForkMutex, then the tree's write lock. No file lock: a process that has the table open goes on
// working on the removed file. Failure: where the file can't be removed, the table has left the tree all the same, and
// can be opened anew from its file.
#include <search.h>
#include <unistd.h>

#include <cstring>

#include "frame/rg_i_call_frame.h"
#include "whole/rg_i_remove_table.h"

namespace
{

constexpr char module_version[] = "rg_x_delete_table 1.0";

// Whether there was a table of that name in the tree.
[[nodiscard]] bool drop_from_tree(rg_i_tree_t & tree, const kt_char_t * p_table_name)
{
    void * const p_node = tfind(p_table_name, &tree.p_tables, rg_i_string_to_table_compare);
    if (p_node == nullptr)
        return false;
    rg_i_table_t * const p_table = *static_cast<rg_i_table_t **>(p_node);
    tdelete(p_table_name, &tree.p_tables, rg_i_string_to_table_compare);
    rg_i_close_if_unused(p_table);
    return true;
}

[[nodiscard]] kt_int32_t delete_table(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path)
{
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    kt_char_ptr_t p_table_name = nullptr;
    kt_uint32_t   block_size   = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&tree, p_registry_path, &p_table_name, &block_size); rc != 0)
        return rc;
    const owned_buffer file_path(block_size != 0 ? p_table_name : nullptr);

    const bool was_in_tree = drop_from_tree(tree, p_table_name);
    if (block_size == 0)
        return was_in_tree ? 0 : rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
    if (const kt_int32_t rc = rg_i_unlink_table_file(p_table_name); rc != 0)
        return rc;
    unlink(std::strcat(p_table_name, ".rewrite")); // resolved paths have room for it
    return 0;
}

} // namespace

extern "C" kt_int32_t rg_delete_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path)
{
    return rg_i_tree_updating_call<entry_id::delete_table>(
        RG_HERE, tree_handle, [&](rg_i_tree_t & tree) { return delete_table(tree, p_registry_path); });
}
