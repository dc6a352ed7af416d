// SPDX-License-Identifier: MIT
// rg_x_list_tables: tells which tables exist under a path, and the same list in the shape of an older interface.
//
// Layer: frame, exported. Two sources that never mix: a path under a mount point reads its directory, and so finds
// tables that nobody has opened; any other path walks the tree's named transient tables.
// Always holds: between the walk's steps the list so far is in the tree, because a walk's action gets no argument of
// its caller's.
// Locking: the tree's write lock, although nothing in the registry changes: it protects the list. No table's lock.
// Failure: the strings made so far are released, and nothing is delivered.
#include <dirent.h>
#include <search.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_call_frame.h"

namespace
{

constexpr char module_version[] = "rg_x_list_tables 1.0";

constexpr kt_uint32_t entries_more     = 100; // by which the list grows
constexpr kt_int32_t  growth_failed    = -1;  // in list_rc
constexpr kt_char_t   lock_file_name[] = ",Lock";
constexpr kt_char_t   rewrite_suffix[] = ".rewrite";

[[nodiscard]] bool begins_with(const kt_char_t * p_text, const kt_char_t * p_prefix)
{
    return std::strncmp(p_text, p_prefix, std::strlen(p_prefix)) == 0;
}

[[nodiscard]] bool ends_with(const kt_char_t * p_text, const kt_char_t * p_suffix)
{
    const size_t length = std::strlen(p_text);
    const size_t suffix = std::strlen(p_suffix);
    return length >= suffix && std::strcmp(p_text + length - suffix, p_suffix) == 0;
}

// ---- The list under construction ----

[[nodiscard]] kt_int32_t start_list(rg_i_tree_t & tree)
{
    tree.max_list_entries   = entries_more;
    tree.total_list_entries = 0;
    tree.list_rc            = 0;
    // One more than the capacity: the list grows only once an entry stands beyond it.
    tree.p_list = static_cast<kt_char_ptr_t *>(std::malloc((entries_more + 1) * sizeof(kt_char_ptr_t)));
    return tree.p_list == nullptr ? rg_i_fail_no_memory(RG_HERE) : 0;
}

void release_list(rg_i_tree_t & tree)
{
    for (kt_uint32_t entry = 0; entry < tree.total_list_entries; ++entry)
        std::free(tree.p_list[entry]);
    std::free(tree.p_list);
    tree.p_list             = nullptr;
    tree.total_list_entries = 0;
}

void grow_list(rg_i_tree_t & tree)
{
    if (tree.total_list_entries <= tree.max_list_entries)
        return;
    const kt_uint32_t capacity = tree.max_list_entries + entries_more;
    void *            p_grown  = std::realloc(tree.p_list, (size_t{capacity} + 1) * sizeof(kt_char_ptr_t));
    if (p_grown == nullptr) {
        tree.list_rc = growth_failed;
        return;
    }
    tree.p_list           = static_cast<kt_char_ptr_t *>(p_grown);
    tree.max_list_entries = capacity;
}

// Enters the prefix with the name behind it. A failure goes to list_rc.
void enter(rg_i_tree_t & tree, const kt_char_t * p_prefix, const kt_char_t * p_name)
{
    grow_list(tree);
    if (tree.list_rc != 0)
        return;
    const size_t prefix  = std::strlen(p_prefix);
    const size_t name    = std::strlen(p_name);
    auto *       p_entry = static_cast<kt_char_ptr_t>(std::malloc(prefix + name + 1));
    if (p_entry == nullptr) {
        tree.list_rc = rg_i_fail_no_memory(RG_HERE);
        return;
    }
    std::memcpy(p_entry, p_prefix, prefix);
    std::memcpy(p_entry + prefix, p_name, name + 1);
    tree.p_list[tree.total_list_entries++] = p_entry;
}

// ---- The directory of a mount point ----

// Whatever else lies in the directory and passes is listed as a table: nothing opens the files.
[[nodiscard]] bool is_listed(const kt_char_t * p_file_name, const kt_char_t * p_prefix)
{
    return p_file_name[0] != '.' && std::strcmp(p_file_name, lock_file_name) != 0 &&
           !ends_with(p_file_name, rewrite_suffix) && begins_with(p_file_name, p_prefix);
}

void enter_files(rg_i_tree_t & tree, DIR * p_directory, const kt_char_t * p_mount_name, const kt_char_t * p_prefix)
{
    for (;;) {
        errno                 = 0;
        const dirent * p_file = readdir(p_directory);
        if (p_file == nullptr) {
            if (errno != 0)
                tree.list_rc = rg_i_fail_system_call(RG_HERE, "readdir", errno);
            return;
        }
        if (!is_listed(p_file->d_name, p_prefix))
            continue;
        enter(tree, p_mount_name, p_file->d_name);
        if (tree.list_rc != 0)
            return;
        kt_char_ptr_t p_entry = tree.p_list[tree.total_list_entries - 1];
        std::replace(p_entry, p_entry + std::strlen(p_entry), ',', '/');
    }
}

[[nodiscard]] DIR * open_directory(rg_i_tree_t & tree, const kt_char_t * p_path)
{
    // The root directory is all that stands ahead of its only "/".
    DIR * p_directory = opendir(p_path[0] != '\0' ? p_path : "/");
    if (p_directory == nullptr)
        tree.list_rc =
            errno == EACCES ? rg_i_fail(RG_HERE, RG_E_ACCESS) : rg_i_fail_system_call(RG_HERE, "opendir", errno);
    return p_directory;
}

// The resolved name is the directory and a prefix of file names in one.
void list_directory(rg_i_tree_t & tree, const kt_char_t * p_registry_path, kt_char_ptr_t p_resolved)
{
    const rg_i_mount_point_t * p_mount_point = rg_i_find_mount_point(&tree, p_registry_path);
    kt_char_ptr_t              p_cut         = std::strrchr(p_resolved, '/');
    if (p_mount_point == nullptr || p_cut == nullptr) { // can't be: the path has just been resolved
        tree.list_rc = rg_i_fail_internal(RG_HERE);
        return;
    }
    *p_cut            = '\0';
    DIR * p_directory = open_directory(tree, p_resolved);
    *p_cut            = '/';
    if (p_directory == nullptr)
        return;
    enter_files(tree, p_directory, p_mount_point->p_name, p_cut + 1);
    closedir(p_directory);
}

// ---- The listing ----

// The form of the path that is listed: that of a mount point with its "/", if it is one, else the caller's own. The
// copy, where one is made, is the guard's.
[[nodiscard]] kt_int32_t choose_form(const rg_i_tree_t & tree, kt_char_ptr_t p_registry_path, owned_buffer & with_slash,
                                     kt_char_ptr_t * p_form)
{
    *p_form             = p_registry_path;
    const size_t length = std::strlen(p_registry_path);
    if (length > 0 && p_registry_path[length - 1] == '/')
        return 0;
    with_slash.reset(static_cast<kt_char_ptr_t>(std::malloc(length + sizeof "/")));
    if (!with_slash)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(with_slash.get(), p_registry_path, length);
    std::memcpy(with_slash.get() + length, "/", sizeof "/");

    const rg_i_mount_point_t sought{with_slash.get(), nullptr, 0};
    if (tfind(&sought, &tree.p_mount_points, rg_i_mount_point_compare) != nullptr)
        *p_form = with_slash.get();
    return 0;
}

void collect(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path, kt_char_ptr_t p_resolved, bool persistent)
{
    tree.p_list_prefix = p_resolved;
    if (persistent)
        list_directory(tree, p_registry_path, p_resolved);
    else
        twalk(tree.p_tables, rg_i_list_tables_action);
    tree.p_list_prefix = nullptr;
}

[[nodiscard]] kt_int32_t deliver(rg_i_tree_t & tree, kt_char_ptr_t ** p_table_list, kt_uint32_t * array_count)
{
    if (tree.list_rc != 0) {
        release_list(tree);
        return tree.list_rc == growth_failed ? rg_i_fail_no_memory(RG_HERE) : tree.list_rc;
    }
    *p_table_list = std::exchange(tree.p_list, nullptr);
    *array_count  = tree.total_list_entries;
    return 0;
}

[[nodiscard]] kt_int32_t list_tables_locked(rg_i_tree_t & tree, kt_char_ptr_t p_registry_path,
                                            kt_char_ptr_t ** p_table_list, kt_uint32_t * array_count)
{
    owned_buffer  with_slash;
    kt_char_ptr_t p_form = nullptr;
    if (const kt_int32_t rc = choose_form(tree, p_registry_path, with_slash, &p_form); rc != 0)
        return rc;
    if (const kt_int32_t rc = start_list(tree); rc != 0)
        return rc;
    kt_char_ptr_t p_resolved = nullptr;
    kt_uint32_t   block_size = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&tree, p_form, &p_resolved, &block_size); rc != 0) {
        release_list(tree);
        return rc;
    }
    const owned_buffer resolved(block_size != 0 ? p_resolved : nullptr);
    collect(tree, p_form, p_resolved, block_size != 0);
    return deliver(tree, p_table_list, array_count);
}

[[nodiscard]] kt_int32_t list_tables(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                     kt_char_ptr_t ** p_table_list, kt_uint32_t * array_count)
{
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    if (p_registry_path == nullptr)
        return rg_i_fail_invalid_path(RG_HERE, nullptr);
    if (p_table_list == nullptr || array_count == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_tree_t &     tree = *static_cast<rg_i_tree_t *>(tree_handle);
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();
    return list_tables_locked(tree, p_registry_path, p_table_list, array_count);
}

[[nodiscard]] kt_int32_t free_table_list(kt_char_ptr_t * p_table_list, kt_uint32_t array_count)
{
    if (p_table_list == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    for (kt_uint32_t entry = 0; entry < array_count; ++entry)
        std::free(p_table_list[entry]);
    std::free(p_table_list);
    return 0;
}

} // namespace

// Acts on each node once, after its subtrees, so the order is that of the search tree's shape.
void rg_i_list_tables_action(const void * p_node, VISIT type, int /*level*/)
{
    if (type != endorder && type != leaf)
        return;
    const rg_i_table_t & table = **static_cast<rg_i_table_t * const *>(p_node);
    rg_i_tree_t &        tree  = *table.p_tree;
    if (tree.list_rc != 0 || tree.p_list == nullptr)
        return;
    // Persistent tables are listed from their directories.
    if (table.p_file_path == nullptr && begins_with(table.p_name, tree.p_list_prefix))
        enter(tree, "", table.p_name);
}

extern "C" kt_int32_t rg_list_tables_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                       kt_char_ptr_t ** p_table_list, kt_uint32_t * array_count)
{
    rg_i_trace_entry(entry_id::list_tables);
    return rg_i_finish_call(entry_id::list_tables,
                            list_tables(tree_handle, p_registry_path, p_table_list, array_count));
}

extern "C" kt_int32_t rg_free_table_list_1(kt_char_ptr_t * p_table_list, kt_uint32_t array_count)
{
    rg_i_trace_entry(entry_id::free_table_list);
    return rg_i_finish_call(entry_id::free_table_list, free_table_list(p_table_list, array_count));
}

// ---- The older shape ----

extern "C" kt_int32_t rg_i_get_directory_list_compat(rg_opaque_handle_t tree_handle, kt_char_ptr_t directory_name,
                                                     rg_entry_metadata_t ** entry_list, kt_uint32_t * array_count)
{
    if (entry_list == nullptr || array_count == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    kt_char_ptr_t * p_table_list = nullptr;
    kt_uint32_t     total_tables = 0;
    if (const kt_int32_t rc = rg_list_tables_1(tree_handle, directory_name, &p_table_list, &total_tables); rc != 0)
        return rc;
    if (total_tables == 0) {
        (void)rg_free_table_list_1(p_table_list, 0);
        *entry_list  = nullptr;
        *array_count = 0;
        return 0;
    }

    auto * p_entries = static_cast<rg_entry_metadata_t *>(std::calloc(total_tables, sizeof(rg_entry_metadata_t)));
    if (p_entries == nullptr) {
        (void)rg_free_table_list_1(p_table_list, total_tables);
        return rg_i_fail_no_memory(RG_HERE);
    }
    for (kt_uint32_t entry = 0; entry < total_tables; ++entry)
        p_entries[entry] = {p_table_list[entry], RG_TABLE, RG_UNKNOWN_STORAGE, p_table_list};
    *entry_list  = p_entries;
    *array_count = total_tables;
    return 0;
}

extern "C" kt_int32_t rg_i_free_directory_list_compat(rg_entry_metadata_t * entry_list, kt_uint32_t array_count)
{
    if (entry_list == nullptr)
        return 0;
    const kt_int32_t rc = rg_free_table_list_1(entry_list[0].p_table_list, array_count);
    std::free(entry_list);
    return rc;
}

extern "C" kt_int32_t rg_i_create_directory_compat(void)
{
    return 0;
}

extern "C" kt_int32_t rg_i_delete_directory_compat(void)
{
    return 0;
}
