// SPDX-License-Identifier: MIT
// rg_x_open_table: gives a caller a handle on a table that exists, in memory or as a file.
//
// Layer: table. All opens of a table in a tree share one object, counted by its references. What mode and control a
// table has is a matter of the object, not of a handle.
// Always holds: a table with a file is in the tree while it is open, a transient one until it is deleted.
// Locking: the tree's write lock from the search to the end, file calls included; under it the write lock of a table
// that was found. No ForkMutex: a forked child may open.
// Failure: nothing has changed, apart from the reference of a failed upgrade, which stays counted. A hash table that is
// passed in is owned from the start.
#include <fcntl.h>
#include <search.h>
#include <unistd.h>

#include <utility>

#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_owned_hash_table.h"
#include "rg_i_table.h"
#include "rg_i_tree.h"

namespace
{

constexpr char module_version[] = "rg_x_open_table 1.0";

// What do_open_table returns in place of 0 when a file was opened, so that the hash table has been used up. It never
// reaches a caller.
constexpr kt_int32_t opened_from_file = 999999;

constexpr kt_int32_t mode_bits = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// What an open asks for.
struct open_request_t {
    rg_i_tree_t * p_tree;
    kt_char_ptr_t p_registry_path;
    kt_char_ptr_t p_file_name; // or the registry path itself: what p_tables knows
    kt_uint32_t   block_size;
    kt_int32_t    mode; // RG_MODE_READ, or RG_MODE_WRITE with or without RG_MODE_EXPLICIT_CONTROL
};

// Write includes read, so 3 is 2 and 7 is 6. Explicit control without writing means nothing.
[[nodiscard]] kt_int32_t normalise_mode(const rg_i_site_t & site, kt_int32_t * p_mode)
{
    const kt_int32_t mode = *p_mode;
    if ((mode & ~mode_bits) != 0 || (mode & (RG_MODE_READ | RG_MODE_WRITE)) == 0 ||
        (mode & (RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL)) == RG_MODE_EXPLICIT_CONTROL)
        return rg_i_fail(site, RG_E_INVALID_MODE);
    if ((mode & RG_MODE_WRITE) != 0)
        *p_mode = mode & ~RG_MODE_READ;
    return 0;
}

[[nodiscard]] kt_uint32_t implicit_control(kt_int32_t mode)
{
    return (mode & RG_MODE_EXPLICIT_CONTROL) == 0 ? 1 : 0;
}

[[nodiscard]] kt_int32_t open_file(const open_request_t & request, owned_hash_table & hash_table,
                                   rg_opaque_handle_t * p_result_table_handle)
{
    rg_i_table_t * p_table = nullptr;
    if (const kt_int32_t rc =
            rg_i_open_persistent_table(request.p_tree, request.p_registry_path, request.p_file_name, request.mode,
                                       request.block_size, hash_table.release(), &p_table);
        rc != 0)
        return rc;
    if (tsearch(p_table, &request.p_tree->p_tables, rg_i_table_compare) == nullptr) {
        rg_i_close_table(p_table);
        return rg_i_fail_no_memory(RG_HERE);
    }
    *p_result_table_handle = p_table;
    return opened_from_file;
}

// Reads the file afresh, for writing, into the object that readers have.
[[nodiscard]] kt_int32_t upgrade_from_file(const open_request_t & request, rg_i_table_t * p_table,
                                           owned_hash_table & hash_table)
{
    // A process that closes any descriptor of a file loses its lock on it. So the reader's descriptor, which nothing
    // reads from any more, goes before the lock is taken, and the lock is never let go of.
    if (const kt_int32_t reader_fd = std::exchange(p_table->file_fd, -1); reader_fd >= 0)
        close(reader_fd);

    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc =
            rg_i_open_persistent_table(request.p_tree, request.p_registry_path, p_table->p_name, request.mode,
                                       p_table->block_size, hash_table.release(), &p_new_table);
        rc != 0)
        return rc;
    const kt_int32_t rc = rg_i_swap_after_metadata_update(p_table, p_new_table);
    if (rc == 0) {
        p_table->implicitly_controlled = p_new_table->implicitly_controlled;
        p_table->mode                  = p_new_table->mode;
    }
    rg_i_close_table(p_new_table);
    return rc != 0 ? rc : opened_from_file;
}

// Counts one more open of a table that is in the tree, and sees what mode and control it has then.
[[nodiscard]] kt_int32_t join(const open_request_t & request, rg_i_table_t * p_table, owned_hash_table & hash_table)
{
    write_guard table_lock(p_table->lock);
    if (table_lock.code() != 0)
        return table_lock.code();

    const bool        asks_to_write = (request.mode & RG_MODE_WRITE) != 0;
    const kt_uint32_t control       = implicit_control(request.mode);

    // The rows of such a table don't lie in its pool, so nothing could be done with them but reading.
    if (asks_to_write && p_table->p_packed_rows_array != nullptr)
        return rg_i_fail(RG_HERE, RG_E_ACCESS);

    // Only a transient table waits in the tree with nobody on it. Its first opener decides alone.
    if (++p_table->references == 1) {
        p_table->implicitly_controlled = control;
        p_table->mode                  = asks_to_write ? RG_MODE_WRITE : RG_MODE_READ;
        return 0;
    }
    // Kept because callers depend on it: a reader that joins a writer changes nothing, and its handle can update.
    if (!asks_to_write)
        return 0;
    if ((p_table->mode & RG_MODE_WRITE) != 0) {
        if ((p_table->implicitly_controlled != 0) == (control != 0))
            return 0;
        --p_table->references;
        return rg_i_fail(RG_HERE, RG_E_EXCLUSIVE_OPEN);
    }
    // A writer joins readers: the table is upgraded for everybody.
    // Kept because callers depend on it: an upgrade that fails keeps the reference that was counted for it.
    if (p_table->p_file_path != nullptr)
        return upgrade_from_file(request, p_table, hash_table);
    p_table->implicitly_controlled = control;
    p_table->mode                  = RG_MODE_WRITE;
    return 0;
}

[[nodiscard]] kt_int32_t open_resolved(const open_request_t & request, owned_hash_table & hash_table,
                                       rg_opaque_handle_t * p_result_table_handle)
{
    void * p_node = tfind(request.p_file_name, &request.p_tree->p_tables, rg_i_string_to_table_compare);
    if (p_node == nullptr) {
        if (request.block_size == 0) // a transient table exists in memory alone
            return rg_i_fail(RG_HERE, RG_E_NO_SUCH_TABLE);
        return open_file(request, hash_table, p_result_table_handle);
    }

    rg_i_table_t *   p_table = *static_cast<rg_i_table_t **>(p_node);
    const kt_int32_t rc      = join(request, p_table, hash_table);
    if (rc == 0 || rc == opened_from_file)
        *p_result_table_handle = p_table;
    return rc;
}

[[nodiscard]] kt_int32_t without_file_mark(kt_int32_t rc)
{
    return rc == opened_from_file ? 0 : rc;
}

[[nodiscard]] kt_int32_t open_hashed(const rg_i_site_t & site, rg_opaque_handle_t tree_handle,
                                     kt_char_ptr_t p_registry_path, kt_int32_t mode, kt_uint32_t total_hash_buckets,
                                     rg_hash_function_t *              p_hash_function,
                                     rg_hash_keys_compare_function_t * p_compare_function,
                                     rg_opaque_handle_t *              p_result_table_handle)
{
    if (total_hash_buckets == 0 || p_hash_function == nullptr || p_compare_function == nullptr)
        return rg_i_fail(site, RG_E_NULL_POINTER);
    rg_hash_table_t * p_hash_table = nullptr;
    if (const kt_int32_t rc =
            rg_i_hash_table_open(total_hash_buckets, p_hash_function, p_compare_function, &p_hash_table);
        rc != 0)
        return rc;
    // A table that was in memory keeps the hash table that it has, and ours has been closed.
    return without_file_mark(do_open_table(tree_handle, p_registry_path, mode, p_hash_table, p_result_table_handle));
}

} // namespace

kt_int32_t do_open_table(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                         rg_hash_table_t * p_rows_hash_table, rg_opaque_handle_t * p_result_table_handle)
{
    owned_hash_table hash_table(p_rows_hash_table);
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    if (p_result_table_handle == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (const kt_int32_t rc = normalise_mode(RG_HERE, &mode); rc != 0)
        return rc;

    auto *      p_tree = static_cast<rg_i_tree_t *>(tree_handle);
    write_guard tree_lock(p_tree->lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();

    open_request_t request{p_tree, p_registry_path, nullptr, 0, mode};
    if (const kt_int32_t rc = rg_i_resolve_path(p_tree, p_registry_path, &request.p_file_name, &request.block_size);
        rc != 0)
        return rc;
    const owned_buffer file_name(request.block_size != 0 ? request.p_file_name : nullptr);
    return open_resolved(request, hash_table, p_result_table_handle);
}

extern "C" kt_int32_t rg_open_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                                      rg_opaque_handle_t * p_result_table_handle)
{
    rg_i_trace_entry(entry_id::open_table);
    const kt_int32_t rc = do_open_table(tree_handle, p_registry_path, mode, nullptr, p_result_table_handle);
    return rg_i_finish_call(entry_id::open_table, without_file_mark(rc));
}

extern "C" kt_int32_t rg_open_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                                 kt_int32_t mode, kt_uint32_t total_hash_buckets,
                                                 rg_hash_function_t *              p_hash_function,
                                                 rg_hash_keys_compare_function_t * p_compare_function,
                                                 rg_opaque_handle_t *              p_result_table_handle)
{
    rg_i_trace_entry(entry_id::open_hashed_key_table);
    const kt_int32_t rc = open_hashed(RG_HERE, tree_handle, p_registry_path, mode, total_hash_buckets, p_hash_function,
                                      p_compare_function, p_result_table_handle);
    return rg_i_finish_call(entry_id::open_hashed_key_table, rc);
}
