// SPDX-License-Identifier: MIT
// rg_i_copy_to_memory: makes a transient table out of another table object, or out of a table file.
//
// Layer: whole. Calls the pool's duplication, and the open of table files.
// Always holds: a copy of an object has the same slots, so that fixed indices and free slots are the source's. Its
// records are its own, but for the names and packed definitions of its columns, which stay in the record that the
// source has them in; those blocks live as long as the copy does. A copy of a copy leads to the first record, and not
// to a chain of copies.
// Locking: the tree's write lock, and the read lock of a source object. Nobody else can see the new object.
// Failure: the new object is closed, and the source as it was.
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <utility>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "storage/rg_i_disk_format.h"
#include "whole/rg_i_duplicate_table.h"

namespace
{

constexpr char module_version[] = "rg_i_copy_to_memory 1.0";

constexpr kt_uint32_t block_size_of_mounts = 512;

// ---- From an object ----

struct copying_t {
    rg_i_table_t & from;
    rg_i_table_t & to;
};

[[nodiscard]] bool is_in_use(const rg_i_index_entry_t & entry)
{
    return entry.p_applied != nullptr || entry.p_committed != nullptr;
}

void copy_fields(const copying_t & copying)
{
    const rg_i_table_t & from        = copying.from;
    rg_i_table_t &       to          = copying.to;
    to.references                    = 0;
    to.total_columns                 = from.total_columns;
    to.total_variable_length_columns = from.total_variable_length_columns;
    to.maximum_rows                  = from.maximum_rows;
    to.total_applied_rows            = from.total_applied_rows;
    to.total_committed_rows          = from.total_committed_rows;
    to.implicitly_controlled         = from.implicitly_controlled;
    to.uncommitted_updates_visible   = from.uncommitted_updates_visible;
    to.change_counter                = from.change_counter;
    to.p_tree                        = from.p_tree;
    to.mode                          = from.mode;
}

// The slots as they are, with the free slot index behind them. Links between free slots are led to the new slots. What
// the slots know of the source's hash table isn't theirs.
[[nodiscard]] kt_int32_t copy_slots(const copying_t & copying)
{
    const rg_i_table_t & from  = copying.from;
    rg_i_table_t &       to    = copying.to;
    const size_t         bytes = rg_i_rows_fixed_index_bytes(from.maximum_rows);
    to.p_rows_fixed_index      = static_cast<rg_i_index_entry_t *>(std::malloc(bytes));
    to.p_rows_packed_index     = static_cast<kt_uint32_t *>(std::calloc(from.maximum_rows, sizeof(kt_uint32_t)));
    if (to.p_rows_fixed_index == nullptr || to.p_rows_packed_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(static_cast<void *>(to.p_rows_fixed_index), from.p_rows_fixed_index, bytes);

    const auto moved = [&](const void * p_slot) -> rg_i_index_entry_t * {
        if (p_slot == nullptr)
            return nullptr;
        return to.p_rows_fixed_index + (static_cast<const rg_i_index_entry_t *>(p_slot) - from.p_rows_fixed_index);
    };
    to.p_rows_free_chain = moved(from.p_rows_free_chain);
    for (kt_uint32_t slot = 0; slot < to.maximum_rows; ++slot) {
        rg_i_index_entry_t & entry = to.p_rows_fixed_index[slot];
        entry.p_pending_change     = moved(entry.p_pending_change); // of free slots only: nothing is pending
        entry.hash_index           = 0;
        entry.p_hash_table_element = nullptr;
    }
    return 0;
}

// Fills the packed index, and a hash table like the source's if it has one, from the source's records. A rebuilt table
// in memory has rows that were never committed, and no list has them: they count like the others here, so that each row
// has a position of its own. Rows of a table copied from packed ones have no records any more.
[[nodiscard]] kt_int32_t give_secondary_access(const copying_t & copying)
{
    const rg_hash_table_t * const p_from_hash = copying.from.p_rows_hash_table;
    rg_i_table_t &                to          = copying.to;
    if (p_from_hash != nullptr)
        if (const kt_int32_t rc = rg_i_hash_table_open(p_from_hash->total_hash_buckets, p_from_hash->p_hash_function,
                                                       p_from_hash->p_compare_function, &to.p_rows_hash_table);
            rc != 0)
            return rc;

    kt_uint32_t rows = 0;
    for (kt_uint32_t slot = 0; slot < to.maximum_rows; ++slot) {
        rg_i_index_entry_t & entry = to.p_rows_fixed_index[slot];
        if (!is_in_use(entry))
            continue;
        ++rows;
        if (entry.p_committed == nullptr)
            entry.p_committed = entry.p_applied; // until the records are led to the copy
    }
    to.p_columns                           = copying.from.p_columns;
    const kt_uint32_t total_committed_rows = std::exchange(to.total_committed_rows, rows);
    const kt_int32_t  rc                   = rg_i_establish_secondary_row_access(&to);
    to.total_committed_rows                = total_committed_rows;
    return rc;
}

// Leads the key of a row's hash element to the copy's record. The source may change its rows from now on, and what it
// puts in their place must not matter here. A row without a record in the copy has its key in the element.
[[nodiscard]] kt_int32_t lead_key_to_copy(rg_i_table_t & to, rg_i_index_entry_t & entry, kt_char_ptr_t p_record)
{
    if (entry.p_hash_table_element == nullptr)
        return 0;
    if (p_record != nullptr) {
        entry.p_hash_table_element->p_key_value = rg_i_row_key(&to, p_record);
        return 0;
    }
    rg_hash_table_element_t * p_element = entry.p_hash_table_element;
    const kt_uint32_t         length    = rg_i_key_length(to.p_columns[0].type, p_element->p_key_value);
    const kt_int32_t          rc = rg_i_hash_table_own_key(to.p_rows_hash_table, entry.hash_index, length, &p_element);
    entry.p_hash_table_element   = p_element;
    return rc;
}

using duplication_map_t = rg_i_record_buffer_pool_duplication_map_t;

[[nodiscard]] kt_int32_t lead_rows_to_copy(const copying_t & copying, duplication_map_t * p_map)
{
    rg_i_table_t & to = copying.to;
    for (kt_uint32_t slot = 0; slot < to.maximum_rows; ++slot) {
        rg_i_index_entry_t &       entry  = to.p_rows_fixed_index[slot];
        const rg_i_index_entry_t & source = copying.from.p_rows_fixed_index[slot];
        if (!is_in_use(source))
            continue;
        entry.p_applied   = rg_i_rb_map_duplicated_address(p_map, source.p_applied);
        entry.p_committed = source.p_committed == source.p_applied
                                ? entry.p_applied
                                : rg_i_rb_map_duplicated_address(p_map, source.p_committed);
        if (const kt_int32_t rc =
                lead_key_to_copy(to, entry, entry.p_committed != nullptr ? entry.p_committed : entry.p_applied);
            rc != 0)
            return rc;
    }
    return 0;
}

// Names and packed definitions stay in the record that the source has them in, and keep its blocks alive.
[[nodiscard]] kt_int32_t borrow_names(const copying_t & copying)
{
    rg_i_record_buffer_pool_t & from_pool = copying.from.record_buffer_pool;
    rg_i_record_buffer_pool_t & to_pool   = copying.to.record_buffer_pool;
    if (from_pool.p_lender == nullptr) {
        if (const kt_int32_t rc = rg_i_rb_share_blocks(&from_pool, &to_pool.p_lender); rc != 0)
            return rc;
    } else {
        rg_i_rb_hold_blocks(from_pool.p_lender);
        to_pool.p_lender = from_pool.p_lender;
    }
    to_pool.p_lent_metadata = rg_i_names_record_data(&copying.from);
    return 0;
}

[[nodiscard]] kt_int32_t lead_to_copy(const copying_t & copying, duplication_map_t * p_map)
{
    if (const kt_int32_t rc = borrow_names(copying); rc != 0)
        return rc;
    rg_i_table_t & to         = copying.to;
    to.p_metadata_record_data = rg_i_rb_map_duplicated_address(p_map, copying.from.p_metadata_record_data);
    to.p_columns = reinterpret_cast<rg_column_t *>(to.p_metadata_record_data + sizeof(rg_i_metadata_head_t));
    return lead_rows_to_copy(copying, p_map);
}

[[nodiscard]] kt_int32_t copy_contents(const copying_t & copying)
{
    rg_i_table_t & to = copying.to;
    if (const kt_int32_t rc = copy_slots(copying); rc != 0)
        return rc;
    duplication_map_t * p_map = nullptr;
    if (const kt_int32_t rc =
            rg_i_rb_duplicate_record_buffer_pool(&copying.from.record_buffer_pool, &to.record_buffer_pool, &p_map);
        rc != 0)
        return rc;
    const rollback free_map([&] { rg_i_rb_free_duplication_map(p_map); });
    if (const kt_int32_t rc = give_secondary_access(copying); rc != 0)
        return rc;
    if (const kt_int32_t rc =
            rg_i_duplicate_application_metadata_buffer(copying.from.p_application_metadata, &to.p_application_metadata);
        rc != 0)
        return rc;
    return lead_to_copy(copying, p_map);
}

} // namespace

kt_int32_t rg_i_duplicate_table_from_memory_to_memory(rg_i_table_t * p_table, const kt_char_t * p_new_name,
                                                      rg_i_table_t ** p_result_table)
{
    if (p_table->p_rows_change_list != nullptr || p_table->p_delete_rows_change_list != nullptr ||
        p_table->ready_for_commit != 0)
        return rg_i_fail(RG_HERE, RG_E_UNCOMMITTED_TABLE);

    rg_i_table_t * p_copy = nullptr;
    if (const kt_int32_t rc = rg_i_create_null_table(&p_copy); rc != 0)
        return rc;
    rollback close_copy([&] { rg_i_close_table(p_copy); });
    copy_fields({*p_table, *p_copy});
    p_copy->p_name = strdup(p_new_name);
    if (p_copy->p_name == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    if (const kt_int32_t rc = copy_contents({*p_table, *p_copy}); rc != 0)
        return rc;
    close_copy.dismiss();
    *p_result_table = p_copy;
    return 0;
}

void rg_i_rename_memory_table(rg_i_table_t * p_source_table, kt_char_ptr_t p_new_name)
{
    std::free(std::exchange(p_source_table->p_name, p_new_name));
}

// ---- From a file ----

kt_int32_t rg_i_duplicate_table_from_persistent_to_memory(rg_i_tree_t * p_tree, kt_char_ptr_t p_absolute_source_path,
                                                          kt_char_ptr_t   p_absolute_target_path,
                                                          rg_i_table_t ** p_new_table)
{
    owned_buffer name(strdup(p_absolute_target_path));
    if (!name)
        return rg_i_fail_no_memory(RG_HERE);
    rg_i_table_t * p_table = nullptr;
    // Kept because callers depend on it: opened for reading alone, the copy is implicitly controlled, whatever control
    // the file is used with elsewhere.
    if (const kt_int32_t rc = rg_i_open_persistent_table(p_tree, p_absolute_target_path, p_absolute_source_path,
                                                         RG_MODE_READ, block_size_of_mounts, nullptr, &p_table);
        rc != 0)
        return rc;

    // Nothing below fails. From here on it is a table without a file.
    close(std::exchange(p_table->file_fd, -1));
    p_table->mode       = RG_MODE_WRITE;
    p_table->block_size = 0;
    std::free(std::exchange(p_table->p_file_path, nullptr));
    p_table->file_path_length                  = 0;
    p_table->commit_record_offset              = 0;
    p_table->applied_commit_record_offset      = 0;
    p_table->commit_record_length              = 0;
    p_table->applied_commit_record_length      = 0;
    p_table->disk_commit_record_length         = 0;
    p_table->disk_applied_commit_record_length = 0;
    std::free(std::exchange(p_table->p_persistent_table_registry_path, nullptr));
    std::free(std::exchange(p_table->p_name, name.release()));
    // Kept because callers depend on it: the reference of the open stays, though no handle stands for it. So the first
    // opener joins a table that is open for writing under implicit control.
    p_table->phantom_references = p_table->references;
    *p_new_table                = p_table;
    return 0;
}
