// SPDX-License-Identifier: MIT
// rg_i_table: the object that stands for a table, and everything that works on it.
//
// A table is a metadata record (columns, names, defaults) and row records in one pool, a row index that keeps for each
// row its applied and its committed version, and two lists of what changed since the last commit. The operations are
// declared by module, in the order of the layers; where a module's head says "write lock", the caller holds it.
#pragma once

#include <sys/uio.h>

#include <cstring>

#include "kt_pmsg.h"
#include "kt_rg.h"
#include "rg_i_application_metadata.h"
#include "rg_i_hash_table.h"
#include "rg_i_read_write_lock.h"
#include "rg_i_record_buffer_pool.h"
#include "rg_i_tree.h"

#pragma pack(push, 1)

// One slot of the row index. The two record pointers alone tell the row's state.
struct rg_i_index_entry_t {
    kt_char_ptr_t             p_applied;            // bytes 0-7: newest record; NULL: deleted, or the slot is free
    kt_char_ptr_t             p_committed;          // bytes 8-15: committed record; NULL: not committed yet
    kt_uint32_t               file_offset;          // bytes 16-19: of the committed record
    kt_uint32_t               applied_file_offset;  // bytes 20-23: of the applied record, between apply and commit
    void *                    p_pending_change;     // bytes 24-31: the row's change entry; on a free slot the next one
    kt_uint32_t               hash_index;           // bytes 32-35: bucket of p_hash_table_element
    rg_hash_table_element_t * p_hash_table_element; // bytes 36-43
    kt_uint32_t               packed_index;         // bytes 44-47: position in p_rows_packed_index
};

// A row on one of the two change lists.
struct rg_i_change_entry_t {
    kt_uint32_t           deletion; // 1 on the delete list, 0 on the rows list
    rg_i_index_entry_t *  p_index_entry;
    rg_i_change_entry_t * p_next;
    rg_i_change_entry_t * p_prev;
};

#pragma pack(pop)

static_assert(sizeof(rg_i_index_entry_t) == 48);
static_assert(offsetof(rg_i_index_entry_t, p_pending_change) == 24 &&
              offsetof(rg_i_index_entry_t, p_hash_table_element) == 36 &&
              offsetof(rg_i_index_entry_t, packed_index) == 44);
static_assert(sizeof(rg_i_change_entry_t) == 28 && offsetof(rg_i_change_entry_t, p_next) == 12);

inline constexpr kt_uint32_t RG_I_IO_VECTOR_ELEMENTS = 16;

struct rg_i_key_index_t;
struct rg_i_change_chunk_t;

struct rg_i_table_struct_t {
    kt_char_ptr_t p_name;   // key in p_tables; the file's path for a persistent table; NULL: unnamed. Owned; guarded
                            // by the tree's lock
    kt_uint32_t references; // opens not yet closed; guarded by the tree's lock
    // From here on: guarded by lock.
    kt_char_ptr_t                 p_metadata_record_data; // in record_buffer_pool
    rg_column_t *                 p_columns;              // in the metadata record; column 0 is the key
    kt_uint32_t                   total_columns;
    kt_uint32_t                   total_variable_length_columns;
    kt_uint32_t                   maximum_rows;         // slots in the two arrays below
    kt_uint32_t                   total_applied_rows;   // rows in the packed index, pending deletions included
    kt_uint32_t                   total_committed_rows; // the count that the last commit left
    rg_i_index_entry_t *          p_rows_fixed_index;   // the slots; the free slot index lies behind them
    kt_uint32_t *                 p_rows_packed_index;  // packed index to fixed index
    rg_i_change_entry_t *         p_rows_change_list;
    rg_i_change_entry_t *         p_rows_change_list_tail;
    rg_i_change_entry_t *         p_delete_rows_change_list;
    rg_i_change_entry_t *         p_delete_rows_change_list_tail;
    kt_uint32_t                   implicitly_controlled;       // 1: each update applies and commits by itself
    kt_uint32_t                   uncommitted_updates_visible; // 1: reads see applied records
    kt_uint64_t                   change_counter;
    kt_uint64_t                   applied_change_counter; // what the next commit makes current
    rg_i_tree_struct_t *          p_tree;
    rg_i_table_struct_t *         p_next;           // no list uses it
    kt_uint32_t                   mode;             // 1 read, 2 write; only bit value 2 is tested
    kt_uint32_t                   block_size;       // of the mount point; 0: transient
    kt_uint32_t                   ready_for_commit; // 0 no apply outstanding, 1 in place, 2 through a rewrite file
    kt_uint32_t                   applied_deletions;
    kt_int32_t                    file_fd;
    kt_int32_t                    rewrite_file_fd;
    kt_char_ptr_t                 p_file_path;          // path and ".rewrite" in one buffer; non-NULL: persistent
    kt_uint32_t                   file_path_length;     // without the suffix
    kt_uint32_t                   commit_record_offset; // memory-image figures of the last open; commit leaves them be
    kt_uint32_t                   applied_commit_record_offset;
    kt_uint32_t                   commit_record_length;
    kt_uint32_t                   applied_commit_record_length;
    kt_uint32_t                   file_length;               // what the rewrite decision compares with
    kt_uint32_t                   disk_commit_record_offset; // where the live commit record stands in the file
    kt_uint32_t                   disk_applied_commit_record_offset;
    kt_uint32_t                   disk_commit_record_length;
    kt_uint32_t                   disk_applied_commit_record_length;
    kt_uint32_t                   disk_file_length; // high-water mark of the file's length
    kt_uint32_t                   rewrite_file_length;
    kt_char_ptr_t                 p_persistent_table_registry_path; // owned
    rg_hash_table_t *             p_rows_hash_table;                // owned; NULL: none
    rg_i_index_entry_t *          p_rows_free_chain;                // free slots, ascending
    rg_i_application_metadata_t * p_application_metadata;           // owned
    kt_array_ptr_t                p_packed_rows_array;              // rows of a table from packed rows; owned
    rg_i_read_write_lock_t        lock;
    rg_i_record_buffer_pool_t     record_buffer_pool;
    struct iovec                  io_vector[RG_I_IO_VECTOR_ELEMENTS]; // scratch for gathering writes
    rg_i_key_index_t *            p_key_index; // leads to keys where there is no hash table; owned; NULL: none
    kt_uint64_t           key_walk_rows;       // rows that walks over the keys have looked at, while there is no index
    rg_i_change_chunk_t * p_change_chunks;     // what the entries of the change lists are taken from; owned
    kt_uint32_t phantom_references; // of references, those that no handle stands for; guarded by the tree's lock
};
using rg_i_table_t = rg_i_table_struct_t;

// ---- Row records ------------------------------------------------------------------------------------------------
//
// Data of a row record: replaces_offset (u32), one 8-byte slot a column, then the indirect data. The same bytes in
// memory, in the file and in a packed buffer. Slots lie at any alignment: copy them.

// Bytes ahead of the indirect data.
[[nodiscard]] inline kt_uint32_t rg_i_row_fixed_length(kt_uint32_t total_columns)
{
    return (2 * total_columns + 1) * 4;
}

[[nodiscard]] inline kt_char_ptr_t rg_i_row_slot(kt_char_ptr_t p_record_data, kt_uint32_t column)
{
    return p_record_data + (2 * static_cast<size_t>(column) + 1) * 4;
}

[[nodiscard]] inline kt_char_ptr_t rg_i_row_indirect_data(kt_char_ptr_t p_record_data, kt_uint32_t total_columns)
{
    return p_record_data + rg_i_row_fixed_length(total_columns);
}

[[nodiscard]] inline kt_uint32_t rg_i_load_u32(const void * p)
{
    kt_uint32_t word;
    std::memcpy(&word, p, sizeof word);
    return word;
}

inline void rg_i_store_u32(void * p, kt_uint32_t word)
{
    std::memcpy(p, &word, sizeof word);
}

// Whether values of the type lie in the indirect data. A type beyond the table is direct.
[[nodiscard]] inline bool rg_i_type_is_indirect(kt_data_type_t type)
{
    return type < KU_DTC_TYPES && (ku_dtc_table_1[type] & KU_DTC_INDIRECT) != 0;
}

// Bytes of indirect data in a row record of the table: the bound for every anchor in it. A record shorter than its
// fixed part doesn't occur: opens refuse it.
[[nodiscard]] kt_uint32_t rg_i_row_indirect_length(const rg_i_table_t * p_table, const kt_char_t * p_record_data);

// The key pointer of a record, for hash elements and comparisons: the slot of a direct key, the stored bytes of an
// indirect one. NULL if the stored anchor leaves the record, or what it leads to isn't a whole key: a damaged record.
[[nodiscard]] kt_char_ptr_t rg_i_row_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record_data);

// Bytes of a whole key at the place that rg_i_row_key tells.
[[nodiscard]] inline kt_uint32_t rg_i_key_length(kt_data_type_t key_type, const kt_char_t * p_key)
{
    if (key_type == KT_CHAR_PTR)
        return static_cast<kt_uint32_t>(std::strlen(p_key) + 1);
    return key_type == KT_RSRC_HANDLE_PTR ? sizeof(kt_resource_handle_t) : sizeof(kt_pmsg_value_t);
}

// The data of the metadata record that the table's names and packed definitions lie in: its own, or that of the table
// which it, or what it was copied from, was copied from in memory. The two records are laid out alike.
[[nodiscard]] inline kt_char_ptr_t rg_i_names_record_data(const rg_i_table_t * p_table)
{
    kt_char_ptr_t p_lent = p_table->record_buffer_pool.p_lent_metadata;
    return p_lent != nullptr ? p_lent : p_table->p_metadata_record_data;
}

// The default data area: the bytes behind the last column, and how many there are.
[[nodiscard]] kt_char_ptr_t rg_i_default_data(const rg_i_table_t * p_table);
[[nodiscard]] kt_uint32_t   rg_i_default_data_length(const rg_i_table_t * p_table);

// Whether two column names are the same. Most differ in their first byte.
[[nodiscard]] inline bool rg_i_same_name(const kt_char_t * p_name1, const kt_char_t * p_name2)
{
    return *p_name1 == *p_name2 && std::strcmp(p_name1, p_name2) == 0;
}

// Column by name, or total_columns if there is none.
[[nodiscard]] inline kt_uint32_t rg_i_find_column(const rg_i_table_t * p_table, const kt_char_t * p_column_name)
{
    const kt_uint32_t total_columns = p_table->total_columns;
    for (kt_uint32_t column = 0; column < total_columns; ++column)
        if (rg_i_same_name(p_table->p_columns[column].name, p_column_name))
            return column;
    return total_columns;
}

// ---- Row index and change lists (table/rg_i_table; write lock, or a table no other thread can see) -----------------

[[nodiscard]] kt_int32_t rg_i_establish_rows_index(rg_i_table_t * p_table, kt_uint32_t maximum_rows);
[[nodiscard]] kt_int32_t rg_i_establish_secondary_row_access(rg_i_table_t * p_table);
[[nodiscard]] kt_int32_t rg_i_grow_index(rg_i_table_t * p_table, kt_uint32_t total_new_rows);
// Bytes of the allocation of p_rows_fixed_index for so many slots: the slots, and behind them the free slot index.
[[nodiscard]] size_t     rg_i_rows_fixed_index_bytes(kt_uint32_t maximum_rows);
void                     rg_i_rows_free_chain_insert(rg_i_table_t * p_table, rg_i_index_entry_t * p_new_entry);
rg_i_index_entry_t *     rg_i_rows_free_chain_remove(rg_i_table_t * p_table);
[[nodiscard]] kt_int32_t rg_i_common_add_change_entry(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry,
                                                      kt_uint32_t deletion);
[[nodiscard]] kt_int32_t rg_i_add_change_entry(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry);
void                     rg_i_free_change_lists(rg_i_table_t * p_table);
// Takes this free slot off the chain.
void rg_i_rows_free_chain_take(rg_i_table_t * p_table, rg_i_index_entry_t * p_entry);
// Takes a row out of the table for good: its hash element, whichever record it still has, its packed position, its
// slot.
[[nodiscard]] kt_int32_t rg_i_remove_row(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry);
kt_int32_t               rg_i_record_contained_in_block(rg_i_table_t * p_table, kt_uint32_t offset, kt_uint32_t length,
                                                        kt_uint32_t * block_id);
kt_char_ptr_t            rg_i_set_data_path(rg_i_table_t * p_table);
kt_char_ptr_t            rg_i_set_rewrite_path(rg_i_table_t * p_table);
// Puts the type's empty value in place of a NULL pointer. Nothing is duplicated, the name notwithstanding.
void rg_i_dup_nonscalar_value(kt_data_type_t type, kt_value_t * p_from_value, kt_value_t * p_to_value);

[[nodiscard]] inline kt_uint32_t rg_i_fixed_row_index(const rg_i_table_t *       p_table,
                                                      const rg_i_index_entry_t * p_index_entry)
{
    return static_cast<kt_uint32_t>(p_index_entry - p_table->p_rows_fixed_index);
}

// ---- Making and destroying table objects (table/rg_i_create_table, table/rg_i_close_table; the tree's write lock) --
//
// Whoever is passed a hash table, here and in the storage section, owns it from the start: when the call returns a
// table has it, or it has been closed, whatever the code. NULL: none.

[[nodiscard]] kt_int32_t rg_i_create_null_table(rg_i_table_t ** p_table);
[[nodiscard]] kt_int32_t rg_i_create_transient_table_common(rg_i_tree_t * p_tree, kt_char_ptr_t p_name,
                                                            rg_column_t * p_columns, kt_uint32_t total_columns,
                                                            kt_int32_t mode, rg_hash_table_t * p_rows_hash_table,
                                                            rg_i_table_t ** p_table);
[[nodiscard]] kt_int32_t rg_i_create_transient_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name,
                                                     rg_column_t * p_columns, kt_uint32_t total_columns,
                                                     kt_int32_t mode, rg_hash_table_t * p_rows_hash_table,
                                                     rg_i_table_t ** p_table);
// A table whose rows are the binaries of an array made from a packed buffer. On success the array is the table's. On a
// failure it stays the caller's, unlike the hash table.
[[nodiscard]] kt_int32_t rg_i_create_read_only_transient_table_from_packed_rows(
    rg_i_tree_t * p_tree, kt_char_ptr_t p_name, rg_column_t * p_columns, kt_uint32_t total_columns,
    rg_hash_table_t * p_rows_hash_table, kt_array_ptr_t p_packed_rows_array, rg_i_table_t ** p_table);
[[nodiscard]] kt_uint32_t rg_i_valid_column_name(kt_char_ptr_t column_name);
[[nodiscard]] kt_int32_t  rg_i_pack_variable_length_default_values(rg_column_t * p_columns, kt_uint32_t total_columns,
                                                                   kt_char_ptr_t * p_default_value_indirect_data,
                                                                   kt_uint32_t *   default_value_indirect_data_length,
                                                                   kt_uint32_t *   total_variable_length_columns_return,
                                                                   ku_iconv_t *    p_string_conversion_handle);
void                      rg_i_swap_columns(rg_column_t * p_column1, rg_column_t * p_column2);
[[nodiscard]] kt_int32_t  rg_i_convert_metadata_memory_record_to_disk_record(kt_char_ptr_t   p_mem_record,
                                                                             kt_char_ptr_t * p_p_disk_metadata_record);
// The same for a table that may have its names in the record of the table that it was copied from.
[[nodiscard]] kt_int32_t rg_i_convert_metadata_to_disk_record(const rg_i_table_t * p_table,
                                                              kt_char_ptr_t *      p_p_disk_metadata_record);
void                     rg_i_convert_columns_pointers_to_offsets(rg_i_table_t * p_table);
void                     rg_i_convert_columns_offsets_to_pointers(rg_i_table_t * p_table);
// Makes the pool hold room for a hundred rows of a guessed size; takes nothing.
[[nodiscard]] kt_int32_t rg_i_reserve_room_for_rows(rg_i_table_t * p_table);
kt_int32_t               rg_i_close_table(rg_i_table_t * p_table);

[[nodiscard]] kt_int32_t rg_x_create_table(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                           rg_column_t * p_columns, kt_uint32_t array_count, kt_int32_t mode,
                                           rg_hash_table_t * p_rows_hash_table, kt_array_ptr_t p_packed_rows_array,
                                           rg_opaque_handle_t * p_result_table_handle);
[[nodiscard]] kt_int32_t do_open_table(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                                       rg_hash_table_t * p_rows_hash_table, rg_opaque_handle_t * p_result_table_handle);

// ---- Persistent tables (storage/; the tree's write lock) -----------------------------------------------------------

[[nodiscard]] kt_int32_t rg_i_create_persistent_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name,
                                                      kt_char_ptr_t p_file_name, rg_column_t * p_columns,
                                                      kt_uint32_t total_columns, kt_int32_t mode,
                                                      kt_uint32_t block_size, rg_hash_table_t * p_rows_hash_table,
                                                      rg_i_table_t ** p_table);
[[nodiscard]] kt_int32_t rg_i_open_persistent_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name,
                                                    kt_char_ptr_t p_file_name, kt_int32_t mode, kt_uint32_t block_size,
                                                    rg_hash_table_t * p_rows_hash_table, rg_i_table_t ** p_table);
// Exchanges the contents of two table objects, so that the handles on p_table stay good.
[[nodiscard]] kt_int32_t rg_i_swap_after_metadata_update(rg_i_table_t * p_table, rg_i_table_t * p_new_table);
// The same in two steps, for who must know ahead of something that can't be undone that the exchange won't fail.
[[nodiscard]] kt_int32_t rg_i_make_room_for_swap(rg_i_table_t * p_table, const rg_i_table_t * p_new_table);
void                     rg_i_swap_with_room(rg_i_table_t * p_table, rg_i_table_t * p_new_table);
[[nodiscard]] kt_int32_t rg_i_create_commit_record(rg_i_application_metadata_t * p_application_metadata,
                                                   kt_uint64_t change_counter, kt_uint32_t * p_commit_record_length,
                                                   kt_char_ptr_t * p_p_commit_record);
[[nodiscard]] kt_int32_t rg_i_open_commit_record(kt_char_ptr_t                 p_commit_record,
                                                 rg_i_application_metadata_t * p_application_metadata,
                                                 kt_uint64_t *                 p_change_counter);

// ---- Transactions (storage/; write lock) ---------------------------------------------------------------------------

// Whether the next apply writes the table whole into a rewrite file.
[[nodiscard]] kt_uint32_t rg_i_rewrite_is_due(const rg_i_table_t * p_table);
[[nodiscard]] kt_int32_t  rg_i_apply(rg_i_table_t * p_table, kt_uint32_t rewrite, kt_uint64_t table_change_counter);
[[nodiscard]] kt_int32_t  rg_i_commit(rg_i_table_t * p_table);
[[nodiscard]] kt_int32_t  rg_i_commit_in_memory(rg_i_table_t * p_table, rg_i_change_entry_t * p_current_change_entry);
kt_int32_t                rg_i_abort(rg_i_table_t * p_table);
[[nodiscard]] kt_int32_t  rg_i_abort_in_memory(rg_i_table_t * p_table, rg_i_change_entry_t * p_current_change_entry);

// ---- Adding rows (rows/rg_i_add_row; write lock) --------------------------------------------------------------------

[[nodiscard]] kt_int32_t rg_i_add_row(rg_i_table_t * p_table, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                      kt_uint32_t total_values);
[[nodiscard]] kt_int32_t rg_i_add_row_raw(rg_i_table_t * p_table, kt_char_ptr_t p_record_data,
                                          kt_value_t * p_input_key_value, rg_i_index_entry_t ** p_p_new_index_entry,
                                          rg_hash_table_element_t ** p_p_existing_hash_table_element);

// ---- Reading (rows/rg_i_get_values; read lock) ---------------------------------------------------------------------

// Client value against stored value: -1, 0, 1 (any sign for strings and handles). A stored value that leaves the
// indirect data of indirect_length bytes equals nothing.
[[nodiscard]] kt_int32_t rg_i_compare_values_within(const kt_value_t * p_value, const void * p_slot,
                                                    kt_data_type_t type, const kt_char_t * p_indirect_data,
                                                    kt_uint32_t indirect_length);
[[nodiscard]] kt_int32_t rg_i_compare_values(kt_value_t * p_value, kt_pmsg_value_t * p_pmsg_value, kt_data_type_t type,
                                             kt_char_ptr_t p_indirect_data);
[[nodiscard]] kt_int32_t rg_i_get_value_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                                        kt_char_ptr_t p_column_name, kt_value_t * p_value,
                                                        kt_uint32_t      uncommitted_updates_visible,
                                                        rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_values_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                                         kt_char_ptr_t * p_column_names, kt_value_t ** p_values,
                                                         kt_uint32_t      total_values,
                                                         kt_uint32_t      uncommitted_updates_visible,
                                                         rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_value_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                                         kt_char_ptr_t p_column_name, kt_value_t * p_value,
                                                         kt_uint32_t      uncommitted_updates_visible,
                                                         rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_values_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                                          kt_char_ptr_t * p_column_names, kt_value_t ** p_values,
                                                          kt_uint32_t      total_values,
                                                          kt_uint32_t      uncommitted_updates_visible,
                                                          rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_value_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t p_column_name,
                                                kt_value_t * p_value, kt_uint32_t uncommitted_updates_visible,
                                                rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_values_for_key(rg_i_table_t * p_table, kt_value_t row_key,
                                                 kt_char_ptr_t * p_column_names, kt_value_t ** p_values,
                                                 kt_uint32_t total_values, kt_uint32_t uncommitted_updates_visible,
                                                 rg_row_state_t * p_row_state);
[[nodiscard]] kt_int32_t rg_i_get_fixed_row_index_for_key(rg_i_table_t * p_table, kt_value_t row_key,
                                                          kt_uint32_t * p_fixed_row_index);
[[nodiscard]] rg_row_state_t rg_i_get_row_state_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index);

// ---- Setting fields (rows/rg_i_set_values; write lock) -------------------------------------------------------------

[[nodiscard]] kt_int32_t rg_i_set_value_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                                        kt_char_ptr_t p_column_name, kt_value_t * p_value);
[[nodiscard]] kt_int32_t rg_i_set_values_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                                         kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                                         kt_uint32_t total_values);
[[nodiscard]] kt_int32_t rg_i_set_value_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                                         kt_char_ptr_t p_column_name, kt_value_t * p_value);
[[nodiscard]] kt_int32_t rg_i_set_values_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                                          kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                                          kt_uint32_t total_values);
[[nodiscard]] kt_int32_t rg_i_set_value_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t p_column_name,
                                                kt_value_t * p_value);
[[nodiscard]] kt_int32_t rg_i_set_values_for_key(rg_i_table_t * p_table, kt_value_t row_key,
                                                 kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                                 kt_uint32_t total_values);

// ---- Deleting rows (rows/rg_i_delete_rows; write lock) -------------------------------------------------------------

// RG_E_ROW_DELETED, with nothing changed, if the row's deletion is pending already.
[[nodiscard]] kt_int32_t rg_i_delete_row(rg_i_table_t * p_table, rg_i_index_entry_t * p_current_index_entry);
// The rows that match the rendered criteria; all rows if there are none.
[[nodiscard]] kt_int32_t rg_i_delete_rows(rg_i_table_t * p_table, kt_char_ptr_t p_selection_criteria);
