// SPDX-License-Identifier: MIT
// rg_x_close_table: takes a handle back.
//
// Layer: table. The last handle on a table with a file, and on an unnamed one, destroys the object. A transient table
// stays in its tree with nobody on it, rows and all, until it is opened again, deleted, or its tree goes.
// Locking: the write lock of the table's tree guards the references and the search trees. The table's own lock isn't
// taken: a caller must not close a handle that another thread is using. No ForkMutex.
#include <search.h>

#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rg_i_tree.h"

namespace
{

constexpr char module_version[] = "rg_x_close_table 1.0";

// Whether the tree knows this very object by its name. Once the object has left the tree another may have the name.
[[nodiscard]] bool is_in_tree(const rg_i_tree_t & tree, const rg_i_table_t * p_table)
{
    void * p_node = tfind(p_table, &tree.p_tables, rg_i_table_compare);
    return p_node != nullptr && *static_cast<rg_i_table_t **>(p_node) == p_table;
}

void close_unnamed(rg_i_tree_t & tree, rg_i_table_t * p_table)
{
    tdelete(p_table, &tree.p_unnamed_tables, rg_i_pointer_compare);
    rg_i_close_table(p_table);
}

void close_named(rg_i_tree_t & tree, rg_i_table_t * p_table)
{
    if (p_table->references > 0)
        --p_table->references;
    if (p_table->references > p_table->phantom_references)
        return;

    const bool in_tree = is_in_tree(tree, p_table);
    if (in_tree && p_table->p_file_path == nullptr)
        return; // a transient table waits for its next opener
    if (in_tree)
        tdelete(p_table, &tree.p_tables, rg_i_table_compare);
    rg_i_close_table(p_table);
}

[[nodiscard]] kt_int32_t close_table(const rg_i_site_t & site, rg_opaque_handle_t table_handle)
{
    if (const kt_int32_t rc = rg_i_check_handle(site, table_handle); rc != 0)
        return rc;
    auto *        p_table = static_cast<rg_i_table_t *>(table_handle);
    rg_i_tree_t & tree    = *p_table->p_tree;
    write_guard   tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();

    if (p_table->p_name == nullptr)
        close_unnamed(tree, p_table);
    else
        close_named(tree, p_table);
    return 0;
}

} // namespace

extern "C" kt_int32_t rg_close_table_1(rg_opaque_handle_t table_handle)
{
    rg_i_trace_entry(entry_id::close_table);
    return rg_i_finish_call(entry_id::close_table, close_table(RG_HERE, table_handle));
}
