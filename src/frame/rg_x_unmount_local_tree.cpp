// SPDX-License-Identifier: MIT
// rg_x_unmount_local_tree: takes a mount point out of a tree. Files and open tables aren't touched.
//
// Layer: frame, exported. Departs from the standard frames: a forked child may unmount, and no update is held up.
// Always holds: only the text that the mount was made with unmounts it.
// Locking: the tree's write lock.
// Failure: nothing changes.
#include <cstdlib>
#include <cstring>

#include "rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_unmount_local_tree 1.0";

// The name that a mount point made with the path would have, were it mounted. The resolved path may be the longer one.
[[nodiscard]] kt_int32_t make_key(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path, owned_buffer & key)
{
    kt_char_ptr_t p_resolved = nullptr;
    kt_uint32_t   block_size = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&tree, p_registry_path, &p_resolved, &block_size); rc != 0)
        return rc;
    const owned_buffer resolved_here(block_size != 0 ? p_resolved : nullptr);

    const size_t length = std::strlen(p_resolved);
    key.reset(static_cast<kt_char_t *>(std::malloc(length + sizeof "/")));
    if (!key)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(key.get(), p_resolved, length);
    std::memcpy(key.get() + length, "/", sizeof "/");
    return 0;
}

void remove_mount_point(rg_i_tree_t & tree, rg_i_mount_point_t * p_mount_point)
{
    tdelete(p_mount_point, &tree.p_mount_points, rg_i_mount_point_compare);
    std::free(p_mount_point->p_filesystem_path);
    std::free(p_mount_point->p_name);
    std::free(p_mount_point);
}

[[nodiscard]] kt_int32_t unmount_local_tree(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path)
{
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    rg_i_tree_t &     tree = *static_cast<rg_i_tree_t *>(tree_handle);
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    if (tree.p_mount_points == nullptr) // ahead of any look at the path
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_MOUNT_POINT);

    owned_buffer key;
    if (const kt_int32_t rc = make_key(tree, p_registry_path, key); rc != 0)
        return rc;
    void * p_node = tfind(key.get(), &tree.p_mount_points, rg_i_string_to_mount_point_delete_compare);
    if (p_node == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_MOUNT_POINT);
    remove_mount_point(tree, *static_cast<rg_i_mount_point_t **>(p_node));
    return 0;
}

} // namespace

extern "C" kt_int32_t rg_unmount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path)
{
    rg_i_trace_entry(entry_id::unmount_local_tree);
    return rg_i_finish_call(entry_id::unmount_local_tree, unmount_local_tree(tree_handle, p_registry_path));
}
