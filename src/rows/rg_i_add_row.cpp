// SPDX-License-Identifier: MIT
// rg_i_add_row: puts one new row into the table's pending state.
//
// Layer: rows. Stands on the record pool, the row index, the hash table and the change lists. Nothing reaches a file
// here: apply writes the record from the change list.
// Always holds: the record is built in room that the pool lends and takes back, and is taken only when the row has its
// slot; every byte that is taken is written here, so that the room needn't be zeroed and adding costs the same whatever
// free record it is lent. Until then a failure leaves the table as it was, but for a pool block and a row index that
// may have grown. Locking: the caller holds the table's write lock.
#include <cstring>

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rows/rg_i_arguments.h"

namespace
{

constexpr char module_version[] = "rg_i_add_row 1.0";

constexpr kt_uint32_t guessed_bytes_per_indirect_column = 32;

// A record under construction in lent room.
struct row_builder {
    rg_i_table_t * p_table;
    ku_iconv_t *   p_string_conversion_handle;
    kt_uint32_t    fixed_length;
    kt_char_ptr_t  p_record; // NULL until the first room is lent
    kt_char_ptr_t  p_previous_free_record;
    kt_uint32_t    capacity;       // bytes of data that the room takes
    kt_uint32_t    running_offset; // bytes of indirect data so far
};

[[nodiscard]] kt_char_ptr_t indirect_data(const row_builder & row)
{
    return row.p_record + row.fixed_length;
}

[[nodiscard]] kt_uint32_t record_data_length(const row_builder & row)
{
    return row.fixed_length + row.running_offset;
}

// Gives the lent room back, of which no byte behind what was built has been written.
void abandon(row_builder & row)
{
    rg_i_rb_give_back_record(&row.p_table->record_buffer_pool, row.p_record, record_data_length(row));
}

// Is lent room for so many bytes, and takes along what was built so far.
[[nodiscard]] kt_int32_t move_to_room(row_builder & row, kt_uint32_t wanted_length)
{
    rg_i_record_buffer_pool_t * p_pool                 = &row.p_table->record_buffer_pool;
    kt_char_ptr_t               p_room                 = nullptr;
    kt_char_ptr_t               p_previous_free_record = nullptr;
    kt_uint32_t                 capacity               = 0;
    if (const kt_int32_t rc = rg_i_rb_lend_record(p_pool, wanted_length, &p_room, &p_previous_free_record, &capacity);
        rc != 0)
        return rc;

    if (row.p_record != nullptr && row.p_record != p_room) {
        std::memcpy(p_room, row.p_record, record_data_length(row));
        abandon(row);
    }
    row.p_record               = p_room;
    row.p_previous_free_record = p_previous_free_record;
    row.capacity               = capacity;
    return 0;
}

[[nodiscard]] kt_int32_t move_to_doubled_room(row_builder & row)
{
    if (row.capacity > UINT32_MAX / 2)
        return rg_i_fail_no_memory(RG_HERE); // the record would pass what its length can say
    return move_to_room(row, 2 * row.capacity);
}

[[nodiscard]] kt_int32_t store_value(row_builder & row, kt_uint32_t column, kt_value_t * p_client_value)
{
    const kt_data_type_t type = row.p_table->p_columns[column].type;
    if (!rg_i_type_is_indirect(type)) {
        std::memcpy(rg_i_row_slot(row.p_record, column), p_client_value, sizeof *p_client_value);
        return 0;
    }

    kt_value_t value;
    rg_i_dup_nonscalar_value(type, p_client_value, &value);
    for (;;) {
        const kt_int32_t result = kt_pmsg_build_conv_protocol_value_1(
            row.p_string_conversion_handle, 0, type, &value, rg_i_row_slot(row.p_record, column), indirect_data(row),
            row.capacity - row.fixed_length, &row.running_offset);
        if (result == 0)
            return 0;
        if (result != KT_PMSG_E_NO_ROOM)
            return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_protocol_value", result);
        if (const kt_int32_t rc = move_to_doubled_room(row); rc != 0)
            return rc;
    }
}

// The default stands in the table's encoding already: it is stored without conversion.
[[nodiscard]] kt_int32_t store_default(row_builder & row, kt_uint32_t column)
{
    const rg_column_t & definition = row.p_table->p_columns[column];
    if (!rg_i_type_is_indirect(definition.type)) {
        std::memcpy(rg_i_row_slot(row.p_record, column), &definition.default_value, sizeof definition.default_value);
        return 0;
    }

    kt_pmsg_value_anchor_t anchor;
    std::memcpy(&anchor, &definition.default_value, sizeof anchor);
    while (anchor.length > row.capacity - row.fixed_length - row.running_offset)
        if (const kt_int32_t rc = move_to_doubled_room(row); rc != 0)
            return rc;

    std::memcpy(indirect_data(row) + row.running_offset, rg_i_default_data(row.p_table) + anchor.offset, anchor.length);
    anchor.offset = row.running_offset;
    std::memcpy(rg_i_row_slot(row.p_record, column), &anchor, sizeof anchor);
    row.running_offset += anchor.length;
    return 0;
}

// Fills in every column from the caller's values and the defaults.
[[nodiscard]] kt_int32_t build_columns(row_builder & row, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                                       kt_uint32_t total_values, kt_value_t ** p_p_input_key_value)
{
    kt_uint32_t input_values_used = 0;
    for (kt_uint32_t column = 0; column < row.p_table->total_columns; ++column) {
        const kt_uint32_t i = rg_i_find_argument(p_column_names, total_values, row.p_table->p_columns[column].name);
        if (i < total_values) {
            if (const kt_int32_t rc = store_value(row, column, p_p_values[i]); rc != 0)
                return rc;
            ++input_values_used;
            if (column == 0)
                *p_p_input_key_value = p_p_values[i];
        } else if (column == 0) {
            return rg_i_fail(RG_HERE, RG_E_KEY_EXPECTED);
        } else if (const kt_int32_t rc = store_default(row, column); rc != 0) {
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

// Takes the slot back that rg_i_add_row_raw gave. A revived slot only loses its new record: its element, its packed
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
[[nodiscard]] kt_int32_t enter_row(row_builder & row, kt_value_t * p_input_key_value)
{
    rg_i_table_t *              p_table            = row.p_table;
    rg_i_record_buffer_pool_t * p_pool             = &p_table->record_buffer_pool;
    rg_i_index_entry_t *        p_index_entry      = nullptr;
    rg_hash_table_element_t *   p_existing_element = nullptr;
    if (const kt_int32_t rc =
            rg_i_add_row_raw(p_table, row.p_record, p_input_key_value, &p_index_entry, &p_existing_element);
        rc != 0) {
        abandon(row);
        return rc;
    }
    if (const kt_int32_t rc = rg_i_rb_take_record(p_pool, row.p_record, row.p_previous_free_record,
                                                  record_data_length(row), RG_RECORD_TYPE_ROW);
        rc != 0) {
        undo_slot(p_table, p_index_entry, p_existing_element);
        abandon(row);
        return rc;
    }
    if (const kt_int32_t rc = rg_i_add_change_entry(p_table, p_index_entry); rc != 0) {
        undo_slot(p_table, p_index_entry, p_existing_element);
        rg_i_rb_free_record(p_pool, row.p_record);
        return rc;
    }

    // Nothing below fails.
    rg_i_store_u32(row.p_record, p_index_entry->p_committed != nullptr ? p_index_entry->file_offset : 0);
    if (p_existing_element != nullptr) {
        if (p_table->applied_deletions != 0)
            --p_table->applied_deletions;
        return 0;
    }
    p_table->p_rows_packed_index[p_table->total_applied_rows] = rg_i_fixed_row_index(p_table, p_index_entry);
    p_index_entry->packed_index                               = p_table->total_applied_rows++;
    return 0;
}

// Whether a row with the key exists, by a walk of the slots over as many live rows as the table counts.
//
// Kept because callers depend on it: the slot just taken is read like any other, though the count doesn't include it
// yet. So a slot that is reused below a live row is reached, and there the new key matches itself: the add fails.
[[nodiscard]] bool scan_finds_key(const rg_i_table_t * p_table, const kt_value_t * p_input_key_value)
{
    const kt_data_type_t key_type   = p_table->p_columns[0].type;
    const kt_uint32_t    total_live = p_table->total_applied_rows - p_table->applied_deletions;
    for (kt_uint32_t visited = 0, slot = 0; visited < total_live && slot < p_table->maximum_rows; ++slot) {
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

// Enters the slot's key into the hash table, or finds the slot of an equal key whose row's deletion is pending: that
// slot then takes the record and is the result.
[[nodiscard]] kt_int32_t enter_key(rg_i_table_t * p_table, kt_char_ptr_t p_record_data,
                                   rg_i_index_entry_t ** p_p_index_entry, rg_hash_table_element_t ** p_p_existing)
{
    rg_i_index_entry_t * p_index_entry = *p_p_index_entry;
    kt_char_ptr_t        p_key         = rg_i_row_key(p_table, p_record_data);
    if (p_key == nullptr) {
        rg_i_rows_free_chain_insert(p_table, p_index_entry);
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    }

    kt_uint32_t               hash_index = 0;
    rg_hash_table_element_t * p_element  = nullptr;
    const kt_int32_t          rc =
        rg_i_hash_table_add(p_table->p_rows_hash_table, p_key, rg_i_fixed_row_index(p_table, p_index_entry),
                            &hash_index, &p_element, p_table->p_columns[0].qualifier);
    if (rc == 0) {
        p_index_entry->hash_index           = hash_index;
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

} // namespace

kt_int32_t rg_i_add_row(rg_i_table_t * p_table, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_values,
                        kt_uint32_t total_values)
{
    if (p_table->ready_for_commit != 0)
        return rg_i_fail(RG_HERE, RG_E_APPLIED_UNCOMMITTED);
    if (rg_i_any_argument_is_null(p_column_names, p_p_values, total_values))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    row_builder row{};
    row.p_table = p_table;
    row.p_string_conversion_handle =
        p_table->p_tree != nullptr ? p_table->p_tree->p_to_table_string_conversion_handle : nullptr;
    row.fixed_length = rg_i_row_fixed_length(p_table->total_columns);
    if (const kt_int32_t rc = move_to_room(row, row.fixed_length + p_table->total_variable_length_columns *
                                                                       guessed_bytes_per_indirect_column);
        rc != 0)
        return rc;

    kt_value_t * p_input_key_value = nullptr;
    if (const kt_int32_t rc = build_columns(row, p_column_names, p_p_values, total_values, &p_input_key_value);
        rc != 0) {
        abandon(row);
        return rc;
    }
    return enter_row(row, p_input_key_value);
}

kt_int32_t rg_i_add_row_raw(rg_i_table_t * p_table, kt_char_ptr_t p_record_data, kt_value_t * p_input_key_value,
                            rg_i_index_entry_t **      p_p_new_index_entry,
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
        if (const kt_int32_t rc = enter_key(p_table, p_record_data, &p_index_entry, &p_existing_element); rc != 0)
            return rc;
    } else if ((p_table->p_columns[0].qualifier & 15u) == RG_PRIMARY_KEY &&
               scan_finds_key(p_table, p_input_key_value)) {
        rg_i_rows_free_chain_insert(p_table, p_index_entry);
        return rg_i_fail(RG_HERE, RG_E_DUPLICATE_KEY);
    }

    *p_p_new_index_entry             = p_index_entry;
    *p_p_existing_hash_table_element = p_existing_element;
    return 0;
}
