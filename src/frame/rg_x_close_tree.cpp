// SPDX-License-Identifier: MIT
// rg_x_close_tree: destroys a tree with every table in it, whoever has them open, and every mount point.
//
// Layer: frame, exported; rg_i_close_tree also tears down a tree whose opening failed.
// Always holds: pending updates of the tables are dropped; their files stay as the last commit left them.
// Locking: Registry_Trees_Mutex, released again, and then the tree's write lock. Departs from the standard frames: a
// forked child may close what it inherited.
// Failure: a lock that fails leaves the tree allocated.
#include <cstdlib>

#include "rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_close_tree 1.0";

void close_conversion_handles(rg_i_tree_t & tree)
{
    if (tree.p_to_table_string_conversion_handle != nullptr)
        ku_iconv_close_1(tree.p_to_table_string_conversion_handle);
    if (tree.p_from_table_string_conversion_handle != nullptr)
        ku_iconv_close_1(tree.p_from_table_string_conversion_handle);
}

// The walks free the nodes behind them: this is how a search tree goes.
void destroy_search_trees(rg_i_tree_t & tree)
{
    twalk(tree.p_tables, rg_i_table_delete_action);
    twalk(tree.p_unnamed_tables, rg_i_unnamed_table_delete_action);
    twalk(tree.p_mount_points, rg_i_mount_point_delete_action);
}

// The result of the mutex. A tree that isn't there isn't noticed.
[[nodiscard]] int leave_the_trees(const rg_i_tree_t * p_tree)
{
    mutex_guard trees_lock(Registry_Trees_Mutex);
    if (trees_lock.code() == 0)
        tdelete(p_tree, &P_Registry_Trees, rg_i_pointer_compare);
    return trees_lock.code();
}

[[nodiscard]] kt_int32_t close_tree(rg_opaque_handle_t tree_handle)
{
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    auto * p_tree = static_cast<rg_i_tree_t *>(tree_handle);
    // Kept because callers depend on it: the mutex's own result goes to the caller, with no error record.
    if (const int result = leave_the_trees(p_tree); result != 0)
        return result;
    return rg_i_close_tree(p_tree);
}

} // namespace

kt_int32_t rg_i_close_tree(rg_i_tree_t * p_tree)
{
    if (const kt_int32_t rc = rg_i_rw_lock_write(&p_tree->lock); rc != 0)
        return rc;
    close_conversion_handles(*p_tree);
    destroy_search_trees(*p_tree);
    rg_i_rw_unlock_write(&p_tree->lock);
    rg_i_rw_close(&p_tree->lock);
    std::free(p_tree);
    return 0;
}

extern "C" kt_int32_t rg_close_tree_1(rg_opaque_handle_t tree_handle)
{
    rg_i_trace_entry(entry_id::close_tree);
    return rg_i_finish_call(entry_id::close_tree, close_tree(tree_handle));
}
