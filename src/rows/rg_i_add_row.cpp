// SPDX-License-Identifier: MIT
// rg_i_add_row: puts one new row into the table's pending state.
//
// Layer: rows. Stands on the row builder, the row index, the hash table and the change lists. Nothing reaches a file
// here: apply writes the record from the change list.
// Always holds: the record is taken from the pool only when the row has its slot and its key has been checked.
// Locking: the caller holds the table's write lock.
// Failure: the table is as it was, but for a pool block and a row index that may have grown.
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rows/rg_i_arguments.h"
#include "rows/rg_i_row_builder.h"
#include "table/rg_i_key_index.h"

namespace
{

constexpr char module_version[] = "rg_i_add_row 1.0";

constexpr kt_uint32_t guessed_bytes_per_indirect_column = 32;

// Stores a column's default, which is in stored form already.
[[nodiscard]] kt_int32_t store_default(rg_i_row_builder_t * p_row, kt_uint32_t column)
{
    rg_i_table_t * p_table = p_row->p_table;
    return rg_i_row_builder_carry_value(p_row, column, &p_table->p_columns[column].default_value,
                                        rg_i_default_data(p_table), rg_i_default_data_length(p_table),
                                        room_grows::by_doubling);
}

// The hash table's bucket for the record's key; any number if there is none for it.
[[nodiscard]] kt_uint32_t bucket_of_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record)
{
    if (p_table->p_rows_hash_table == nullptr)
        return 0;
    kt_char_ptr_t p_key = rg_i_row_key(p_table, p_record);
    return p_key != nullptr ? rg_i_hash_table_bucket(p_table->p_rows_hash_table, p_key) : 0;
}

// The same for a row whose other columns are still to be stored: the bucket comes from memory meanwhile.
[[nodiscard]] kt_uint32_t foresee_bucket_of_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record)
{
    const kt_uint32_t bucket = bucket_of_key(p_table, p_record);
    if (p_table->p_rows_hash_table != nullptr)
        rg_i_hash_table_fetch_bucket(p_table->p_rows_hash_table, bucket);
    return bucket;
}

// Fills in every column from the caller's values and the defaults, whatever the qualifier of a column that isn't named.
[[nodiscard]] kt_int32_t store_columns(rg_i_row_builder_t * p_row, kt_char_ptr_t * p_column_names,
                                       kt_value_t ** p_p_values, kt_uint32_t total_values,
                                       kt_value_t ** p_p_input_key_value, kt_uint32_t * p_bucket)
{
    const rg_i_table_t *   p_table           = p_row->p_table;
    kt_uint32_t            input_values_used = 0;
    rg_i_argument_search_t arguments{p_column_names, total_values};
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        const kt_uint32_t i = arguments.find(p_table->p_columns[column].name);
        if (i < total_values) {
            if (const kt_int32_t rc = rg_i_row_builder_store_value(p_row, column, p_p_values[i]); rc != 0)
                return rc;
            ++input_values_used;
            if (column == 0) {
                *p_p_input_key_value = p_p_values[i];
                *p_bucket            = foresee_bucket_of_key(p_table, p_row->p_record);
            }
        } else if (column == 0) {
            return rg_i_fail(RG_HERE, RG_E_KEY_EXPECTED);
        } else if (const kt_int32_t rc = store_default(p_row, column); rc != 0) {
            return rc;
        }
    }
    // A name that no column has, and the second of two equal names, are never used.
    if (input_values_used != total_values)
        return rg_i_fail(RG_HERE, RG_E_NO_COLUMNS);
    if (*p_p_input_key_value == nullptr)
        return rg_i_fail(RG_HERE, RG_E_KEY_EXPECTED);
    return 0;
}

// Whether a row with the key exists, by a walk of the slots over as many live rows as the table counts.
//
// Kept because callers depend on it: the slot just taken is read like any other, though the count doesn't include it
// yet. So a slot that is reused below a live row is reached, and there the new key matches itself: the add fails.
[[nodiscard]] bool scan_finds_key(const rg_i_table_t * p_table, const kt_value_t * p_input_key_value,
                                  kt_uint32_t * p_rows_visited)
{
    const kt_data_type_t key_type   = p_table->p_columns[0].type;
    const kt_uint32_t    total_live = p_table->total_applied_rows - p_table->applied_deletions;
    kt_uint32_t &        visited    = *p_rows_visited;
    for (kt_uint32_t slot = 0; visited < total_live && slot < p_table->maximum_rows; ++slot) {
        kt_char_ptr_t p_record = p_table->p_rows_fixed_index[slot].p_applied;
        if (p_record == nullptr)
            continue;
        ++visited;
        if (rg_i_compare_values_within(p_input_key_value, rg_i_row_slot(p_record, 0), key_type,
                                       rg_i_row_indirect_data(p_record, p_table->total_columns),
                                       rg_i_row_indirect_length(p_table, p_record)) == 0)
            return true;
    }
    return false;
}

// The outcome of that walk.
[[nodiscard]] bool key_exists(rg_i_table_t * p_table, const kt_value_t * p_input_key_value, kt_uint32_t new_slot)
{
    if (const rg_i_key_answer answer = rg_i_key_index_find_duplicate(p_table, *p_input_key_value, new_slot);
        answer != rg_i_key_answer::unknown)
        return answer == rg_i_key_answer::present;
    kt_uint32_t rows_visited = 0;
    const bool  found        = scan_finds_key(p_table, p_input_key_value, &rows_visited);
    rg_i_key_index_note_walk(p_table, rows_visited, 1);
    return found;
}

// Enters the slot's key into the hash table, or finds the slot of an equal key whose row's deletion is pending: that
// slot then takes the record and is the result.
[[nodiscard]] kt_int32_t enter_key(rg_i_table_t * p_table, kt_char_ptr_t p_record_data, kt_uint32_t bucket,
                                   rg_i_index_entry_t ** p_p_index_entry, rg_hash_table_element_t ** p_p_existing)
{
    rg_i_index_entry_t * p_index_entry = *p_p_index_entry;
    kt_char_ptr_t        p_key         = rg_i_row_key(p_table, p_record_data);
    if (p_key == nullptr) {
        rg_i_rows_free_chain_insert(p_table, p_index_entry);
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    }

    rg_hash_table_element_t * p_element = nullptr;
    const kt_int32_t          rc        = rg_i_hash_table_add_to_bucket(p_table->p_rows_hash_table, bucket, p_key,
                                                                        rg_i_fixed_row_index(p_table, p_index_entry), &p_element,
                                                                        p_table->p_columns[0].qualifier);
    if (rc == 0) {
        p_index_entry->hash_index           = bucket;
        p_index_entry->p_hash_table_element = p_element;
        return 0;
    }
    rg_i_rows_free_chain_insert(p_table, p_index_entry);
    if (rc != RG_E_DUPLICATE_KEY)
        return rc;

    rg_i_index_entry_t * p_existing_entry = &p_table->p_rows_fixed_index[p_element->row_index];
    if (p_existing_entry->p_applied != nullptr)
        return rg_i_fail(RG_HERE, RG_E_DUPLICATE_KEY);
    p_existing_entry->p_applied = p_record_data;
    *p_p_index_entry            = p_existing_entry;
    *p_p_existing               = p_element;
    return 0;
}

// Takes a slot for a finished record and enters its key, which belongs in that bucket if there is a hash table.
[[nodiscard]] kt_int32_t take_slot(rg_i_table_t * p_table, kt_char_ptr_t p_record_data, kt_value_t * p_input_key_value,
                                   kt_uint32_t bucket, rg_i_index_entry_t ** p_p_new_index_entry,
                                   rg_hash_table_element_t ** p_p_existing_hash_table_element)
{
    rg_i_index_entry_t * p_index_entry = rg_i_rows_free_chain_remove(p_table);
    if (p_index_entry == nullptr) {
        if (const kt_int32_t rc = rg_i_grow_index(p_table, p_table->maximum_rows); rc != 0)
            return rc;
        p_index_entry = rg_i_rows_free_chain_remove(p_table);
    }
    p_index_entry->p_applied = p_record_data; // ahead of any check of the key: the scan reads it

    rg_hash_table_element_t * p_existing_element = nullptr;
    if (p_table->p_rows_hash_table != nullptr) {
        if (const kt_int32_t rc = enter_key(p_table, p_record_data, bucket, &p_index_entry, &p_existing_element);
            rc != 0)
            return rc;
    } else {
        const kt_uint32_t slot = rg_i_fixed_row_index(p_table, p_index_entry);
        if ((p_table->p_columns[0].qualifier & 15u) == RG_PRIMARY_KEY && key_exists(p_table, p_input_key_value, slot)) {
            rg_i_rows_free_chain_insert(p_table, p_index_entry);
            return rg_i_fail(RG_HERE, RG_E_DUPLICATE_KEY);
        }
        rg_i_key_index_note_record(p_table, slot);
    }

    *p_p_new_index_entry             = p_index_entry;
    *p_p_existing_hash_table_element = p_existing_element;
    return 0;
}

// Takes the slot back that take_slot gave. A revived slot only loses its new record: its element, its packed
// position and its entry on the delete list are those of the row whose deletion is pending.
void undo_slot(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry,
               const rg_hash_table_element_t * p_existing_element)
{
    if (p_existing_element != nullptr) {
        p_index_entry->p_applied = nullptr;
        return;
    }
    if (p_table->p_rows_hash_table != nullptr)
        (void)rg_i_hash_table_remove_element(p_table->p_rows_hash_table, p_index_entry->hash_index,
                                             p_index_entry->p_hash_table_element);
    rg_i_rows_free_chain_insert(p_table, p_index_entry);
}

// Gives the finished record its slot, its place in the pool and its entry on the change list.
[[nodiscard]] kt_int32_t enter_row(rg_i_row_builder_t * p_row, kt_value_t * p_input_key_value, kt_uint32_t bucket)
{
    rg_i_table_t *            p_table            = p_row->p_table;
    rg_i_index_entry_t *      p_index_entry      = nullptr;
    rg_hash_table_element_t * p_existing_element = nullptr;
    if (const kt_int32_t rc =
            take_slot(p_table, p_row->p_record, p_input_key_value, bucket, &p_index_entry, &p_existing_element);
        rc != 0) {
        rg_i_row_builder_abandon(p_row);
        return rc;
    }
    const kt_uint32_t replaces_offset = p_index_entry->p_committed != nullptr ? p_index_entry->file_offset : 0;
    if (const kt_int32_t rc = rg_i_row_builder_take(p_row, replaces_offset); rc != 0) {
        undo_slot(p_table, p_index_entry, p_existing_element);
        rg_i_row_builder_abandon(p_row);
        return rc;
    }
    if (const kt_int32_t rc = rg_i_add_change_entry(p_table, p_index_entry); rc != 0) {
        undo_slot(p_table, p_index_entry, p_existing_element);
        rg_i_rb_free_record(&p_table->record_buffer_pool, p_row->p_record);
        return rc;
    }

    // Nothing below fails.
    if (p_existing_element != nullptr) {
        if (p_table->applied_deletions != 0)
            --p_table->applied_deletions;
        return 0; // a revived row keeps its fixed and its packed index
    }
    p_table->p_rows_packed_index[p_table->total_applied_rows] = rg_i_fixed_row_index(p_table, p_index_entry);
    p_index_entry->packed_index                               = p_table->total_applied_rows++;
    return 0;
}

} // namespace

kt_int32_t rg_i_add_row(rg_i_table_t * p_table, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                        kt_uint32_t total_values)
{
    if (p_table->ready_for_commit != 0)
        return rg_i_fail(RG_HERE, RG_E_APPLIED_UNCOMMITTED);
    if (rg_i_any_argument_is_null(p_column_names, p_p_values, total_values))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    const kt_uint32_t guessed_length = rg_i_row_fixed_length(p_table->total_columns) +
                                       p_table->total_variable_length_columns * guessed_bytes_per_indirect_column;
    rg_i_row_builder_t row;
    if (const kt_int32_t rc = rg_i_row_builder_open(&row, p_table, guessed_length); rc != 0)
        return rc;

    kt_value_t * p_input_key_value = nullptr;
    kt_uint32_t  bucket            = 0;
    if (const kt_int32_t rc =
            store_columns(&row, p_column_names, p_p_values, total_values, &p_input_key_value, &bucket);
        rc != 0) {
        rg_i_row_builder_abandon(&row);
        return rc;
    }
    return enter_row(&row, p_input_key_value, bucket);
}

kt_int32_t rg_i_add_row_raw(rg_i_table_t * p_table, kt_char_ptr_t p_record_data, kt_value_t * p_input_key_value,
                            rg_i_index_entry_t **      p_p_new_index_entry,
                            rg_hash_table_element_t ** p_p_existing_hash_table_element)
{
    return take_slot(p_table, p_record_data, p_input_key_value, bucket_of_key(p_table, p_record_data),
                     p_p_new_index_entry, p_p_existing_hash_table_element);
}
