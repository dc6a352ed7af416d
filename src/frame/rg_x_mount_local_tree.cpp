// SPDX-License-Identifier: MIT
// rg_x_mount_local_tree: gives a directory of the file system a registry path; tables below it are files from then on.
//
// Layer: frame, exported.
// Always holds: a mount point's name is the registry path with "/" added, even behind a "/" (such a mount point never
// matches a path). Nothing is mounted before its directory is there.
// Locking: ForkMutex, then the tree's write lock.
// Failure: nothing is mounted and nothing stays allocated; directories that were made stay.
#include <cstdlib>
#include <cstring>

#include "rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_mount_local_tree 1.0";

constexpr kt_uint32_t BLOCK_SIZE = 512;

// A path at or below a mount point can't be mounted, nor can one that is the name of a table.
[[nodiscard]] kt_int32_t check_path_is_free(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path)
{
    kt_char_ptr_t p_name     = nullptr;
    kt_uint32_t   block_size = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&tree, p_registry_path, &p_name, &block_size); rc != 0)
        return rc;
    if (block_size != 0) {
        std::free(p_name);
        return rg_i_fail(RG_HERE, RG_E_MOUNT_POINT_EXISTS);
    }
    if (tfind(p_registry_path, &tree.p_tables, rg_i_string_to_table_compare) != nullptr)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    return 0;
}

[[nodiscard]] kt_int32_t make_directory(const kt_char_t * p_filesystem_path)
{
    const owned_buffer writable(strdup(p_filesystem_path));
    if (!writable)
        return rg_i_fail_no_memory(RG_HERE);
    return rg_i_create_all_directories_in_path(writable.get());
}

// The path with "/" added; NULL: no memory.
[[nodiscard]] kt_char_ptr_t make_mount_name(const kt_char_t * p_registry_path)
{
    const size_t length = std::strlen(p_registry_path);
    auto *       p_name = static_cast<kt_char_t *>(std::malloc(length + sizeof "/"));
    if (p_name != nullptr) {
        std::memcpy(p_name, p_registry_path, length);
        std::memcpy(p_name + length, "/", sizeof "/");
    }
    return p_name;
}

[[nodiscard]] kt_int32_t enter_mount_point(rg_i_tree_t & tree, const kt_char_t * p_registry_path,
                                           const kt_char_t * p_filesystem_path)
{
    owned_ptr<rg_i_mount_point_t> mount_point(
        static_cast<rg_i_mount_point_t *>(std::malloc(sizeof(rg_i_mount_point_t))));
    owned_buffer name(make_mount_name(p_registry_path));
    owned_buffer filesystem_path(strdup(p_filesystem_path));
    if (!mount_point || !name || !filesystem_path)
        return rg_i_fail_no_memory(RG_HERE);
    *mount_point.get() = rg_i_mount_point_t{name.get(), filesystem_path.get(), BLOCK_SIZE};

    void * p_node = tsearch(mount_point.get(), &tree.p_mount_points, rg_i_mount_point_compare);
    if (p_node == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    if (*static_cast<rg_i_mount_point_t **>(p_node) != mount_point.get())
        return rg_i_fail(RG_HERE, RG_E_MOUNT_POINT_EXISTS);

    // The tree owns all three now.
    static_cast<void>(name.release());
    static_cast<void>(filesystem_path.release());
    static_cast<void>(mount_point.release());
    return 0;
}

[[nodiscard]] kt_int32_t mount_local_tree(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path,
                                          const kt_char_t * p_filesystem_path)
{
    if (p_filesystem_path == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    if (const kt_int32_t rc = check_path_is_free(tree, p_registry_path); rc != 0)
        return rc;
    if (const kt_int32_t rc = make_directory(p_filesystem_path); rc != 0)
        return rc;
    return enter_mount_point(tree, p_registry_path, p_filesystem_path);
}

} // namespace

// Kept because callers depend on it: the directory is made whatever `create` says.
extern "C" kt_int32_t rg_mount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                            kt_char_ptr_t p_filesystem_path, kt_int32_t)
{
    return rg_i_tree_updating_call<entry_id::mount_local_tree>(RG_HERE, tree_handle, [&](rg_i_tree_t & tree) {
        return mount_local_tree(tree, p_registry_path, p_filesystem_path);
    });
}
