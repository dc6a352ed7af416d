// SPDX-License-Identifier: MIT
// rg_x_create_table: makes a new table at a registry path, and opens it for writing.
//
// Layer: table. Where the path lies decides what the table is: under a mount point it gets a file, elsewhere it lives
// in the tree's memory. The objects themselves are made in rg_i_create_table and in storage. Always holds: a table is
// in the tree exactly if its creation succeeded. Locking: ForkMutex, and under it the tree's write lock for the whole
// creation, file calls included. Failure: nothing has changed, but that a file stays if the tree has no memory for its
// table. A hash table that is passed in is owned from the start.
#include <search.h>
#include <sys/stat.h>

#include <cerrno>

#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_owned_hash_table.h"
#include "rg_i_table.h"
#include "rg_i_tree.h"

namespace
{

constexpr char module_version[] = "rg_x_create_table 1.0";

constexpr kt_int32_t mode_bits = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// What a creation asks for.
struct create_request_t {
    rg_i_tree_t * p_tree;
    kt_char_ptr_t p_registry_path;
    kt_char_ptr_t p_table_name; // the file's path, or the registry path itself: what p_tables knows
    kt_uint32_t   block_size;
    rg_column_t * p_columns;
    kt_uint32_t   total_columns;
    kt_int32_t    mode; // RG_MODE_WRITE with or without RG_MODE_EXPLICIT_CONTROL
    // The rows of a table from a packed buffer, which has no others and is read-only; NULL: the table starts empty.
    // Goes to the table when the creation succeeds.
    kt_array_ptr_t p_packed_rows_array;
};

[[nodiscard]] kt_int32_t create_with_file(const create_request_t & request, owned_hash_table & hash_table,
                                          rg_i_table_t ** p_p_table)
{
    // Kept because callers depend on it: whatever else keeps stat from answering counts as a table that exists.
    struct stat status;
    if (stat(request.p_table_name, &status) == 0 || errno != ENOENT)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    return rg_i_create_persistent_table(request.p_tree, request.p_registry_path, request.p_table_name,
                                        request.p_columns, request.total_columns, request.mode, request.block_size,
                                        hash_table.release(), p_p_table);
}

[[nodiscard]] kt_int32_t create_in_memory(const create_request_t & request, owned_hash_table & hash_table,
                                          rg_i_table_t ** p_p_table)
{
    if (request.p_packed_rows_array != nullptr)
        return rg_i_create_read_only_transient_table_from_packed_rows(
            request.p_tree, request.p_table_name, request.p_columns, request.total_columns, hash_table.release(),
            request.p_packed_rows_array, p_p_table);
    return rg_i_create_transient_table(request.p_tree, request.p_table_name, request.p_columns, request.total_columns,
                                       request.mode, hash_table.release(), p_p_table);
}

[[nodiscard]] kt_int32_t create_resolved(const create_request_t & request, owned_hash_table & hash_table,
                                         rg_opaque_handle_t * p_result)
{
    if (tfind(request.p_table_name, &request.p_tree->p_tables, rg_i_string_to_table_compare) != nullptr)
        return rg_i_fail(RG_HERE, RG_E_TABLE_EXISTS);
    if (request.block_size != 0 && request.p_packed_rows_array != nullptr)
        return RG_E_INTERNAL; // without a record: packed rows make transient tables only

    rg_i_table_t * p_table = nullptr;
    if (const kt_int32_t rc = request.block_size != 0 ? create_with_file(request, hash_table, &p_table)
                                                      : create_in_memory(request, hash_table, &p_table);
        rc != 0)
        return rc;
    if (tsearch(p_table, &request.p_tree->p_tables, rg_i_table_compare) == nullptr) {
        p_table->p_packed_rows_array = nullptr; // the caller's again
        rg_i_close_table(p_table);              // a file stays, and can be opened
        return rg_i_fail_no_memory(RG_HERE);
    }
    *p_result = p_table;
    return 0;
}

} // namespace

kt_int32_t rg_x_create_table(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, rg_column_t * p_columns,
                             kt_uint32_t array_count, kt_int32_t mode, rg_hash_table_t * p_rows_hash_table,
                             kt_array_ptr_t p_packed_rows_array, rg_opaque_handle_t * p_result_table_handle)
{
    owned_hash_table hash_table(p_rows_hash_table);
    if (const kt_int32_t rc = rg_i_check_handle(RG_HERE, tree_handle); rc != 0)
        return rc;
    if (p_result_table_handle == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if ((mode & ~mode_bits) != 0)
        return rg_i_fail(RG_HERE, RG_E_INVALID_MODE);

    auto *      p_tree = static_cast<rg_i_tree_t *>(tree_handle);
    write_guard tree_lock(p_tree->lock);
    if (tree_lock.code() != 0)
        return tree_lock.code();

    // Kept because callers depend on it: a creation always writes, and only the bit for explicit control counts.
    create_request_t request{p_tree,
                             p_registry_path,
                             nullptr,
                             0,
                             p_columns,
                             array_count,
                             RG_MODE_WRITE | (mode & RG_MODE_EXPLICIT_CONTROL),
                             p_packed_rows_array};
    if (const kt_int32_t rc = rg_i_resolve_path(p_tree, p_registry_path, &request.p_table_name, &request.block_size);
        rc != 0)
        return rc;
    const owned_buffer table_name(request.block_size != 0 ? request.p_table_name : nullptr);
    return create_resolved(request, hash_table, p_result_table_handle);
}

extern "C" kt_int32_t rg_create_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                        rg_column_t * p_columns, kt_uint32_t array_count, kt_int32_t mode,
                                        rg_opaque_handle_t * p_result_table_handle)
{
    return rg_i_exclusive_call<entry_id::create_table>([&] {
        return rg_x_create_table(tree_handle, p_registry_path, p_columns, array_count, mode, nullptr, nullptr,
                                 p_result_table_handle);
    });
}

extern "C" kt_int32_t rg_create_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                                   rg_column_t * p_columns, kt_uint32_t array_count, kt_int32_t mode,
                                                   kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                                   rg_hash_keys_compare_function_t * p_compare_function,
                                                   rg_opaque_handle_t *              p_result_table_handle)
{
    const rg_i_site_t site = RG_HERE;
    return rg_i_exclusive_call<entry_id::create_hashed_key_table>([&]() -> kt_int32_t {
        if (total_hash_buckets == 0 || p_hash_function == nullptr || p_compare_function == nullptr)
            return rg_i_fail(site, RG_E_NULL_POINTER);
        rg_hash_table_t * p_hash_table = nullptr;
        if (const kt_int32_t rc =
                rg_i_hash_table_open(total_hash_buckets, p_hash_function, p_compare_function, &p_hash_table);
            rc != 0)
            return rc;
        return rg_x_create_table(tree_handle, p_registry_path, p_columns, array_count, mode, p_hash_table, nullptr,
                                 p_result_table_handle);
    });
}
