// SPDX-License-Identifier: MIT
// rg_i_binary_search_tree: what orders the search trees of the C library that hold tables and mount points, and what
// takes them apart.
//
// Layer: frame. Calls rg_i_close_table; called by whoever searches, fills or empties a tree object's trees.
// Always holds: names are unique in a tree, and so is each object's place in it.
// Locking: the caller holds the lock of the tree object.
// Failure: none; it is tsearch that allocates, and its callers that report.
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "rg_i_table.h"
#include "rg_i_tree.h"

namespace
{

const kt_char_t * table_name(const void * p_table)
{
    return static_cast<const rg_i_table_t *>(p_table)->p_name;
}

const kt_char_t * mount_name(const void * p_mount_point)
{
    return static_cast<const rg_i_mount_point_t *>(p_mount_point)->p_name;
}

// Each node is visited up to three times; at these two visits the walk has done with it, so that it may be freed.
bool is_last_visit(VISIT type)
{
    return type == endorder || type == leaf;
}

// A node's first word is the pointer to its element.
template <class T> T * element_of(const void * p_node)
{
    return *static_cast<T * const *>(p_node);
}

void free_node(const void * p_node)
{
    std::free(const_cast<void *>(p_node));
}

void close_table_of_node(const void * p_node)
{
    rg_i_close_table(element_of<rg_i_table_t>(p_node));
    free_node(p_node);
}

} // namespace

int rg_i_table_compare(const void * p_element1, const void * p_element2)
{
    return std::strcmp(table_name(p_element1), table_name(p_element2));
}

int rg_i_mount_point_compare(const void * p_element1, const void * p_element2)
{
    return std::strcmp(mount_name(p_element1), mount_name(p_element2));
}

int rg_i_string_to_mount_point_compare(const void * p_path, const void * p_mount_point)
{
    const kt_char_t * p_name = mount_name(p_mount_point);
    const kt_char_t * p_text = static_cast<const kt_char_t *>(p_path);
    return std::strncmp(p_text, p_name, std::strlen(p_name)) == 0 ? 0 : std::strcmp(p_text, p_name);
}

int rg_i_string_to_mount_point_delete_compare(const void * p_path, const void * p_mount_point)
{
    return std::strcmp(static_cast<const kt_char_t *>(p_path), mount_name(p_mount_point));
}

int rg_i_string_to_table_compare(const void * p_path, const void * p_table)
{
    return std::strcmp(static_cast<const kt_char_t *>(p_path), table_name(p_table));
}

int rg_i_pointer_compare(const void * p_element1, const void * p_element2)
{
    const auto address1 = reinterpret_cast<std::uintptr_t>(p_element1);
    const auto address2 = reinterpret_cast<std::uintptr_t>(p_element2);
    return (address1 > address2) - (address1 < address2);
}

void rg_i_mount_point_delete_action(const void * p_node, VISIT type, int)
{
    if (!is_last_visit(type))
        return;
    rg_i_mount_point_t * p_mount_point = element_of<rg_i_mount_point_t>(p_node);
    std::free(p_mount_point->p_filesystem_path);
    std::free(p_mount_point->p_name);
    std::free(p_mount_point);
    free_node(p_node);
}

void rg_i_table_delete_action(const void * p_node, VISIT type, int)
{
    if (is_last_visit(type))
        close_table_of_node(p_node);
}

void rg_i_unnamed_table_delete_action(const void * p_node, VISIT type, int)
{
    if (is_last_visit(type))
        close_table_of_node(p_node);
}
