// SPDX-License-Identifier: MIT
// rg_i_remove_table: takes tables off the disk and out of their trees.
//
// Layer: whole. Called by deletions and moves.
// Always holds: the file goes first, and only if it went does the rewrite file follow, with the outcome ignored.
// Objects aren't closed: handles may still lead to them.
// Locking: the caller holds the write lock of the table's tree. No file lock is taken: a process that has the table
// open goes on working on the removed file.
// Failure: the table is still in its tree, and its file where it was.
#include "whole/rg_i_remove_table.h"

#include <search.h>
#include <unistd.h>

#include <cerrno>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_remove_table 1.0";

} // namespace

kt_int32_t rg_i_unlink_table_file(const kt_char_t * p_path)
{
    if (unlink(p_path) == 0)
        return 0;
    if (errno == ENOENT)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
    if (errno == EACCES)
        return rg_i_fail(RG_HERE, RG_E_ACCESS);
    return rg_i_fail_system_call(RG_HERE, "unlink", errno);
}

void rg_i_leave_tree(rg_i_table_t * p_table)
{
    rg_i_tree_t & tree = *p_table->p_tree;
    if (p_table->p_name == nullptr) {
        tdelete(p_table, &tree.p_unnamed_tables, rg_i_pointer_compare);
        return;
    }
    // Once the object has left its tree another table may have its name.
    void * const p_node = tfind(p_table, &tree.p_tables, rg_i_table_compare);
    if (p_node != nullptr && *static_cast<rg_i_table_t **>(p_node) == p_table)
        tdelete(p_table, &tree.p_tables, rg_i_table_compare);
}

kt_int32_t rg_i_remove_table(rg_i_table_t * p_table)
{
    if (p_table->p_file_path != nullptr) {
        if (const kt_int32_t rc = rg_i_unlink_table_file(rg_i_set_data_path(p_table)); rc != 0)
            return rc;
        unlink(rg_i_set_rewrite_path(p_table));
    }
    rg_i_leave_tree(p_table);
    return 0;
}

kt_int32_t rg_i_remove_persistent_table_without_handle(const kt_char_t * p_absolute_table_path)
{
    // Kept because callers depend on it: the rewrite file stays, until tables are repaired or the next table of that
    // name takes it over.
    return rg_i_unlink_table_file(p_absolute_table_path);
}

void rg_i_close_if_unused(rg_i_table_t * p_table)
{
    if (p_table->references <= p_table->phantom_references)
        rg_i_close_table(p_table);
}
