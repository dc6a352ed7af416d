// SPDX-License-Identifier: MIT
// rg_i_dump_tree: prints a tree with all its tables and mount points to standard output.
//
// Layer: diagnostics, exported under its own name. Always holds: each node of a search tree prints once, after those
// below it, so that the output follows the shape of the tree and not the order of the names. Locking: none. The caller
// keeps the tree still, or takes what it gets. Failure: none.
#include "rg_i_tree.h"

#include <cstdio>

#include "diagnostics/rg_i_dump_table.h"

namespace
{

// A node's first word is the pointer to its element. NULL: not the visit at which a node prints.
template <class T> [[nodiscard]] T * element_at_last_visit(const void * p_node, VISIT type)
{
    return type == endorder || type == leaf ? *static_cast<T * const *>(p_node) : nullptr;
}

void dump_whole_table(const void * p_node, VISIT type)
{
    if (auto * const p_table = element_at_last_visit<rg_i_table_t>(p_node, type); p_table != nullptr)
        rg_i_dump_table(p_table, stdout, RG_I_DUMP_ALL);
}

void rg_i_table_dump_action(const void * p_node, VISIT type, int)
{
    dump_whole_table(p_node, type);
}

void rg_i_unnamed_table_dump_action(const void * p_node, VISIT type, int)
{
    dump_whole_table(p_node, type);
}

void rg_i_mount_point_dump_action(const void * p_node, VISIT type, int)
{
    const auto * const p_mount_point = element_at_last_visit<const rg_i_mount_point_t>(p_node, type);
    if (p_mount_point == nullptr)
        return;
    std::printf("    p_name(%s)\n", p_mount_point->p_name);
    std::printf("    p_filesystem_path(%s)\n", p_mount_point->p_filesystem_path);
}

} // namespace

extern "C" kt_int32_t rg_i_dump_tree(rg_i_tree_t * p_tree)
{
    std::printf("Tree p_tree(%p)\n", static_cast<void *>(p_tree));
    if (p_tree == nullptr)
        return 0;
    std::printf("  p_tables(%p)\n", p_tree->p_tables);
    twalk(p_tree->p_tables, rg_i_table_dump_action);
    std::printf("  p_unnamed_tables(%p)\n", p_tree->p_unnamed_tables);
    twalk(p_tree->p_unnamed_tables, rg_i_unnamed_table_dump_action);
    std::printf("  p_mount_points(%p)\n", p_tree->p_mount_points);
    twalk(p_tree->p_mount_points, rg_i_mount_point_dump_action);
    std::printf("  p_to_table_string_conversion_handle(%p)\n",
                static_cast<void *>(p_tree->p_to_table_string_conversion_handle));
    std::printf("  p_from_table_string_conversion_handle(%p)\n",
                static_cast<void *>(p_tree->p_from_table_string_conversion_handle));
    return 0;
}
