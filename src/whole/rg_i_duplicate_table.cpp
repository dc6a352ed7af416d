// SPDX-License-Identifier: MIT
// rg_i_duplicate_table: copies and moves whole tables: decides who does the work, locks, and refreshes a target that is
// open.
//
// Layer: whole. Calls the mechanics of rg_i_copy_to_file and rg_i_copy_to_memory.
// Always holds: what can fail comes first. The name of a new table in memory is taken in the tree before the work is
// done, and a moved source goes only when the target stands. A table file is opened by nobody between its locks.
// Locking: the tree's write lock throughout. Under it the source's read lock, then for a target under a mount point the
// directory's lock file and the target's file. A target that is refreshed is write-locked, behind all of these.
// Failure: source and target are as they were; an empty target file that was made to take the name stays.
#include "whole/rg_i_duplicate_table.h"

#include <search.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "whole/rg_i_remove_table.h"
#include "whole/rg_i_tree_locks.h"

namespace
{

constexpr char module_version[] = "rg_i_duplicate_table 1.0";

constexpr kt_char_t rewrite_suffix[] = ".rewrite";

// What is asked for, resolved. Names are those that p_tables knows.
struct duplication_t {
    rg_i_tree_t &  tree;
    bool           moves;
    bool           overwrites;
    rg_i_table_t * p_source          = nullptr; // NULL: the source is a file that no table of the tree stands for
    kt_char_ptr_t  p_source_name     = nullptr; // of a source given by its path
    kt_char_ptr_t  p_target_name     = nullptr;
    kt_uint32_t    target_block_size = 0;       // 0: the target is in memory
    rg_i_table_t * p_target          = nullptr; // the table that has the target's name by now
};

[[nodiscard]] rg_i_table_t * find_table(const rg_i_tree_t & tree, const kt_char_t * p_name)
{
    void * const p_node = tfind(p_name, &tree.p_tables, rg_i_string_to_table_compare);
    return p_node != nullptr ? *static_cast<rg_i_table_t **>(p_node) : nullptr;
}

// Runs the work under the read lock of the source, if the source is a table object.
template <class Work> [[nodiscard]] kt_int32_t with_source_locked(const duplication_t & d, Work && work)
{
    if (d.p_source == nullptr)
        return work();
    const read_guard source_lock(d.p_source->lock);
    return source_lock.code() != 0 ? source_lock.code() : work();
}

// ---- A target under a mount point ----

[[nodiscard]] kt_int32_t write_target_file(const duplication_t & d, kt_char_ptr_t p_rewrite_path, bool target_is_there)
{
    if (target_is_there && !d.overwrites)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    if (d.p_source == nullptr)
        return d.moves ? rg_i_rename_persistent_table(d.p_source_name, d.p_target_name)
                       : rg_i_duplicate_table_from_persistent_to_persistent(d.p_source_name, d.p_target_name,
                                                                            p_rewrite_path);
    if (const kt_int32_t rc =
            rg_i_duplicate_table_from_memory_to_persistent(d.p_source, d.p_target_name, p_rewrite_path);
        rc != 0)
        return rc;
    if (d.moves) // Kept because callers depend on it: a source that can't be removed doesn't fail the move.
        (void)rg_i_remove_table(d.p_source);
    return 0;
}

// Does the work under the file locks. *p_tried says that they were had, and the result is that of the work.
[[nodiscard]] kt_int32_t write_locked_target_file(const duplication_t & d, bool * p_tried)
{
    const size_t path_length = std::strlen(d.p_target_name);
    owned_buffer rewrite_path(static_cast<kt_char_ptr_t>(std::malloc(path_length + sizeof rewrite_suffix)));
    if (!rewrite_path)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(rewrite_path.get(), d.p_target_name, path_length);
    std::memcpy(rewrite_path.get() + path_length, rewrite_suffix, sizeof rewrite_suffix);

    const kt_int32_t given_fd      = d.p_target != nullptr ? d.p_target->file_fd : -1;
    kt_int32_t       target_fd     = given_fd;
    kt_int32_t       tree_lock_fd  = -1;
    kt_int32_t       target_length = 0;
    if (const kt_int32_t rc = rg_i_lock_local_tree_and_target_table_if_it_exists(d.p_target_name, &target_fd,
                                                                                 &tree_lock_fd, &target_length);
        rc != 0)
        return rc;
    const unique_fd tree_lock(tree_lock_fd);
    const unique_fd target(given_fd < 0 ? target_fd : -1);
    *p_tried = true;
    return write_target_file(d, rewrite_path.get(), target_length != 0);
}

// Reads the target's file afresh into the object that handles lead to.
[[nodiscard]] kt_int32_t reread_target(const duplication_t & d, rg_hash_table_t * p_hash_table)
{
    rg_i_table_t & target = *d.p_target;
    rg_i_table_t * p_new  = nullptr;
    kt_int32_t     rc =
        rg_i_open_persistent_table(&d.tree, d.p_target_name, d.p_target_name, static_cast<kt_int32_t>(target.mode),
                                   target.block_size, p_hash_table, &p_new);
    if (rc == 0) {
        rc = rg_i_swap_after_metadata_update(&target, p_new);
        rg_i_close_table(p_new);
    }
    // Where the work had failed it was the same file, and closing any descriptor of it gave up its lock.
    if ((target.mode & RG_MODE_WRITE) != 0 && lockf(target.file_fd, F_LOCK, 0) != 0 && rc == 0)
        rc = rg_i_fail_system_call(RG_HERE, "lockf", errno);
    return rc;
}

[[nodiscard]] kt_int32_t refresh_target(const duplication_t & d, kt_int32_t work_rc)
{
    const write_guard target_lock(d.p_target->lock);
    if (target_lock.code() != 0)
        return target_lock.code();

    // Kept because callers depend on it: where the target has a hash table, the result of opening the next one replaces
    // the result of the work. So a failure of the work, a target that exists without overwrite among them, is
    // forgotten, and the target shows its unchanged file.
    rg_hash_table_t * p_hash_table = nullptr;
    if (const rg_hash_table_t * const p_old = d.p_target->p_rows_hash_table; p_old != nullptr)
        work_rc = rg_i_hash_table_open(p_old->total_hash_buckets, p_old->p_hash_function, p_old->p_compare_function,
                                       &p_hash_table);
    return work_rc != 0 ? work_rc : reread_target(d, p_hash_table);
}

[[nodiscard]] kt_int32_t duplicate_to_file(const duplication_t & d)
{
    bool       tried = false;
    kt_int32_t rc    = with_source_locked(d, [&] { return write_locked_target_file(d, &tried); });
    if (tried && d.p_target != nullptr && d.p_target->p_file_path != nullptr)
        rc = refresh_target(d, rc);
    // A source that was moved, and that nobody has open, has nobody left who would close it.
    if (d.moves && d.p_source != nullptr && d.p_source->p_name != nullptr &&
        find_table(d.tree, d.p_source->p_name) != d.p_source)
        rg_i_close_if_unused(d.p_source);
    return rc;
}

// ---- A target in memory ----

[[nodiscard]] kt_int32_t move_in_memory(const duplication_t & d, rg_i_table_t ** p_p_new)
{
    owned_buffer name(strdup(d.p_target_name));
    if (!name)
        return rg_i_fail_no_memory(RG_HERE);

    // Nothing below fails. A file that can't be removed stays, and the table leaves its place in the tree all the same.
    if (rg_i_remove_table(d.p_source) != 0)
        rg_i_leave_tree(d.p_source);
    rg_i_rename_memory_table(d.p_source, name.release());
    *p_p_new = d.p_source;
    return 0;
}

[[nodiscard]] kt_int32_t make_target_table(const duplication_t & d, rg_i_table_t ** p_p_new)
{
    if (d.p_source != nullptr)
        return d.moves ? move_in_memory(d, p_p_new)
                       : rg_i_duplicate_table_from_memory_to_memory(d.p_source, d.p_target_name, p_p_new);
    if (const kt_int32_t rc =
            rg_i_duplicate_table_from_persistent_to_memory(&d.tree, d.p_source_name, d.p_target_name, p_p_new);
        rc != 0)
        return rc;
    if (d.moves) // Kept because callers depend on it: a source that can't be removed doesn't fail the move.
        (void)rg_i_remove_persistent_table_without_handle(d.p_source_name);
    return 0;
}

[[nodiscard]] kt_int32_t duplicate_to_memory(const duplication_t & d)
{
    if (d.p_target != nullptr && !d.overwrites)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    // Takes the name ahead of the work, since the tree may have no memory for it. Nobody looks here meanwhile.
    rg_i_table_t placeholder{};
    placeholder.p_name = d.p_target_name;
    if (tsearch(&placeholder, &d.tree.p_tables, rg_i_table_compare) == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    rg_i_table_t *   p_new = nullptr;
    const kt_int32_t rc    = with_source_locked(d, [&] { return make_target_table(d, &p_new); });
    if (rc != 0) {
        if (d.p_target == nullptr)
            tdelete(&placeholder, &d.tree.p_tables, rg_i_table_compare);
        return rc;
    }

    // Nothing below fails. The node is looked for again: nodes change places when others leave.
    void * const p_node                   = tfind(d.p_target_name, &d.tree.p_tables, rg_i_string_to_table_compare);
    *static_cast<rg_i_table_t **>(p_node) = p_new;
    // Kept because callers depend on it: handles on a table that is overwritten in memory dangle from here on.
    if (d.p_target != nullptr)
        rg_i_close_table(d.p_target);
    return 0;
}

// ---- Finding source and target ----

// 0, or why the table can't go where it is already. A table with a file may be copied onto itself.
[[nodiscard]] kt_int32_t refuse_itself(const duplication_t & d)
{
    if (d.p_source != nullptr)
        return d.p_source == d.p_target && (d.moves || d.target_block_size == 0) ? rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS)
                                                                                 : 0;
    if (std::strcmp(d.p_source_name, d.p_target_name) != 0)
        return 0;
    // Looked for first: an empty file would be made to take the name.
    struct stat status;
    if (stat(d.p_source_name, &status) != 0 && errno == ENOENT)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
    return d.moves ? rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS) : 0;
}

[[nodiscard]] kt_int32_t duplicate_to(duplication_t & d, kt_char_ptr_t p_target_path)
{
    if (const kt_int32_t rc = rg_i_resolve_path(&d.tree, p_target_path, &d.p_target_name, &d.target_block_size);
        rc != 0)
        return rc;
    const owned_buffer target_name(d.target_block_size != 0 ? d.p_target_name : nullptr);
    d.p_target = find_table(d.tree, d.p_target_name);
    if (const kt_int32_t rc = refuse_itself(d); rc != 0)
        return rc;
    return d.target_block_size != 0 ? duplicate_to_file(d) : duplicate_to_memory(d);
}

[[nodiscard]] kt_int32_t duplicate_from_path(duplication_t & d, kt_char_ptr_t p_source_path,
                                             kt_char_ptr_t p_target_path)
{
    kt_uint32_t block_size = 0;
    if (const kt_int32_t rc = rg_i_resolve_path(&d.tree, p_source_path, &d.p_source_name, &block_size); rc != 0)
        return rc;
    const owned_buffer source_name(block_size != 0 ? d.p_source_name : nullptr);
    d.p_source = find_table(d.tree, d.p_source_name);
    if (d.p_source == nullptr && block_size == 0)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
    return duplicate_to(d, p_target_path);
}

} // namespace

kt_int32_t rg_i_duplicate_table(rg_opaque_handle_t tree_handle, rg_opaque_handle_t source_table_handle,
                                kt_char_ptr_t p_source_path, kt_char_ptr_t p_target_path, kt_int32_t remove_source,
                                kt_int32_t overwrite_target)
{
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    rg_i_tree_t &     tree = *static_cast<rg_i_tree_t *>(tree_handle);
    const write_guard tree_lock(tree.lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();

    duplication_t d{tree, remove_source != 0, overwrite_target != 0};
    if (source_table_handle == nullptr)
        return duplicate_from_path(d, p_source_path, p_target_path);
    d.p_source = static_cast<rg_i_table_t *>(source_table_handle);
    return duplicate_to(d, p_target_path);
}
