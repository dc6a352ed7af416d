// SPDX-License-Identifier: MIT
// rg_i_get_values: reads values out of a row, finds rows by key, and tells a row's state.
//
// Layer: rows. Stands on the table object and the hash table; adding, setting and selecting rows stand on it.
// Always holds: a read changes nothing in the table and allocates nothing but the value that it delivers, which shares
// nothing with the row record and belongs to the caller. Stored anchors are never trusted: each read is bounded by the
// record that it reads, and a damaged key equals nothing.
// Locking: the caller holds the table's read lock or its write lock.
// Failure: the plural reads deliver one value at a time, so that a failure leaves what was delivered ahead of it with
// the caller.
#include <cstring>

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rows/rg_i_arguments.h"
#include "table/rg_i_key_index.h"

namespace
{

constexpr char module_version[] = "rg_i_get_values 1.0";

template <class T> [[nodiscard]] kt_int32_t compare_integers(T client, T stored)
{
    return client < stored ? -1 : client > stored ? 1 : 0;
}

// Kept because callers depend on it: a NaN on either side compares equal to anything.
template <class T> [[nodiscard]] kt_int32_t compare_floats(T client, T stored)
{
    return stored > client ? -1 : client > stored ? 1 : 0;
}

// Compares with a stored value whose indirect bytes, if it has any, are whole.
[[nodiscard]] kt_int32_t compare_whole(const kt_value_t & client, const kt_pmsg_value_t & stored, kt_data_type_t type,
                                       const kt_char_t * p_indirect_data)
{
    switch (type) {
    case KT_INT32:
        return compare_integers(client.val_int32, stored.val_int32);
    case KT_UINT32:
        return compare_integers(client.val_uint32, stored.val_uint32);
    case KT_INT64:
        return compare_integers(client.val_int64, stored.val_int64);
    case KT_UINT64:
        return compare_integers(client.val_uint64, stored.val_uint64);
    case KT_FLOAT32:
        return compare_floats(client.val_float32, stored.val_float32);
    case KT_FLOAT64:
        return compare_floats(client.val_float64, stored.val_float64);
    case KT_CHAR_PTR: {
        // The client's string is compared as it stands, without conversion to the table's encoding.
        const kt_char_t * p_client = client.ptr_char != nullptr ? client.ptr_char : ku_ptr_empty_char_1;
        return std::strcmp(p_client, p_indirect_data + stored.val_anchor.offset);
    }
    case KT_RSRC_HANDLE_PTR: {
        kt_resource_handle_ptr_t p_client =
            client.ptr_rsrc_handle != nullptr ? client.ptr_rsrc_handle : ku_ptr_invld_rsrc_hndl_1;
        return ku_rsrc_hndl_cmp_1(p_client, const_cast<kt_char_t *>(p_indirect_data + stored.val_anchor.offset));
    }
    default:
        return -1; // such a type is no key type
    }
}

// Whether the bytes of a stored string or handle lie in the indirect data and are a whole string or handle.
[[nodiscard]] bool key_bytes_are_whole(const kt_pmsg_value_anchor_t & anchor, kt_data_type_t type,
                                       const kt_char_t * p_indirect_data, kt_uint32_t indirect_length)
{
    if (anchor.offset > indirect_length || anchor.length > indirect_length - anchor.offset)
        return false;
    if (type == KT_RSRC_HANDLE_PTR)
        return anchor.length >= sizeof(kt_resource_handle_t);
    return anchor.length > 0 && p_indirect_data[anchor.offset + anchor.length - 1] == '\0';
}

// The record that a read sees, or NULL if the row has none in that role. Either flag widens what is shown.
[[nodiscard]] kt_char_ptr_t visible_record(const rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                           kt_uint32_t uncommitted_updates_visible)
{
    const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[fixed_row_index];
    return uncommitted_updates_visible != 0 || p_table->uncommitted_updates_visible != 0 ? entry.p_applied
                                                                                         : entry.p_committed;
}

[[nodiscard]] kt_int32_t deliver_value(const rg_i_table_t * p_table, kt_char_ptr_t p_record, kt_uint32_t column,
                                       kt_value_t * p_value)
{
    const kt_char_t *    p_slot = rg_i_row_slot(p_record, column);
    const kt_data_type_t type   = p_table->p_columns[column].type;
    if (!rg_i_type_is_indirect(type)) {
        std::memcpy(p_value, p_slot, sizeof *p_value);
        return 0;
    }

    ku_iconv_t * p_handle =
        p_table->p_tree != nullptr ? p_table->p_tree->p_from_table_string_conversion_handle : nullptr;
    const kt_int32_t result = kt_pmsg_build_conv_packed_client_value_1(
        p_handle, 0, type, p_value, p_slot, rg_i_row_indirect_data(p_record, p_table->total_columns),
        rg_i_row_indirect_length(p_table, p_record));
    if (result != 0)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", result);
    return 0;
}

// Position in the fixed index by a walk of the packed index, or maximum_rows if no row has the key. The committed
// record goes ahead of the applied one, so that an updated row is found under its committed key, and a row whose
// deletion is pending is found at all.
[[nodiscard]] kt_uint32_t scan_for_key(const rg_i_table_t * p_table, const kt_value_t & row_key,
                                       kt_data_type_t key_type, kt_uint32_t * p_rows_visited)
{
    const kt_uint32_t total_applied_rows = p_table->total_applied_rows;
    for (kt_uint32_t row_index = 0; row_index < total_applied_rows; ++row_index) {
        const kt_uint32_t          fixed_row_index = p_table->p_rows_packed_index[row_index];
        const rg_i_index_entry_t & entry           = p_table->p_rows_fixed_index[fixed_row_index];
        *p_rows_visited                            = row_index + 1;
        const kt_char_ptr_t p_record               = entry.p_committed != nullptr ? entry.p_committed : entry.p_applied;
        if (p_record == nullptr)
            continue;
        if (rg_i_compare_values_within(&row_key, rg_i_row_slot(p_record, 0), key_type,
                                       rg_i_row_indirect_data(p_record, p_table->total_columns),
                                       rg_i_row_indirect_length(p_table, p_record)) == 0)
            return fixed_row_index;
    }
    return p_table->maximum_rows;
}

// The outcome of that walk.
[[nodiscard]] kt_uint32_t find_key(rg_i_table_t * p_table, const kt_value_t & row_key, kt_data_type_t key_type)
{
    kt_uint32_t fixed_row_index = p_table->maximum_rows;
    if (rg_i_key_index_find(p_table, row_key, &fixed_row_index) != rg_i_key_answer::unknown)
        return fixed_row_index;
    kt_uint32_t rows_visited = 0;
    fixed_row_index          = scan_for_key(p_table, row_key, key_type, &rows_visited);
    rg_i_key_index_note_walk(p_table, rows_visited, 0);
    return fixed_row_index;
}

} // namespace

kt_int32_t rg_i_compare_values_within(const kt_value_t * p_value, const void * p_slot, kt_data_type_t type,
                                      const kt_char_t * p_indirect_data, kt_uint32_t indirect_length)
{
    kt_pmsg_value_t stored;
    std::memcpy(&stored, p_slot, sizeof stored);
    if (rg_i_type_is_indirect(type) && !key_bytes_are_whole(stored.val_anchor, type, p_indirect_data, indirect_length))
        return -1;
    return compare_whole(*p_value, stored, type, p_indirect_data);
}

kt_int32_t rg_i_compare_values(kt_value_t * p_value, kt_pmsg_value_t * p_pmsg_value, kt_data_type_t type,
                               kt_char_ptr_t p_indirect_data)
{
    kt_pmsg_value_t stored;
    std::memcpy(&stored, static_cast<const void *>(p_pmsg_value), sizeof stored);
    return compare_whole(*p_value, stored, type, p_indirect_data);
}

kt_int32_t rg_i_get_value_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                          kt_char_ptr_t p_column_name, kt_value_t * p_value,
                                          kt_uint32_t uncommitted_updates_visible, rg_row_state_t * p_row_state)
{
    if (p_column_name == nullptr || p_value == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    // The bound is the size of the index: a slot that no row has is no wrong index but a row without a record.
    if (fixed_row_index >= p_table->maximum_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    const kt_uint32_t column = rg_i_find_column(p_table, p_column_name);
    if (column == p_table->total_columns)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    kt_char_ptr_t p_record = visible_record(p_table, fixed_row_index, uncommitted_updates_visible);
    if (p_record == nullptr)
        return rg_i_fail(RG_HERE, RG_E_ROW_DELETED);

    if (const kt_int32_t rc = deliver_value(p_table, p_record, column, p_value); rc != 0)
        return rc;
    if (p_row_state != nullptr)
        *p_row_state = rg_i_get_row_state_for_fixed_index(p_table, fixed_row_index);
    return 0;
}

kt_int32_t rg_i_get_values_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index,
                                           kt_char_ptr_t * p_column_names, kt_value_t ** p_values,
                                           kt_uint32_t total_values, kt_uint32_t uncommitted_updates_visible,
                                           rg_row_state_t * p_row_state)
{
    if (rg_i_any_argument_is_null(p_column_names, p_values, total_values))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (fixed_row_index >= p_table->maximum_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    // Kept because callers depend on it: here the row is tested ahead of the names, in the single form behind the name.
    kt_char_ptr_t p_record = visible_record(p_table, fixed_row_index, uncommitted_updates_visible);
    if (p_record == nullptr)
        return rg_i_fail(RG_HERE, RG_E_ROW_DELETED);

    for (kt_uint32_t i = 0; i < total_values; ++i) {
        const kt_uint32_t column = rg_i_find_column(p_table, p_column_names[i]);
        if (column == p_table->total_columns)
            return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
        if (const kt_int32_t rc = deliver_value(p_table, p_record, column, p_values[i]); rc != 0)
            return rc;
    }
    if (p_row_state != nullptr)
        *p_row_state = rg_i_get_row_state_for_fixed_index(p_table, fixed_row_index);
    return 0;
}

kt_int32_t rg_i_get_value_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index, kt_char_ptr_t p_column_name,
                                           kt_value_t * p_value, kt_uint32_t uncommitted_updates_visible,
                                           rg_row_state_t * p_row_state)
{
    if (row_index >= p_table->total_applied_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    return rg_i_get_value_for_fixed_index(p_table, p_table->p_rows_packed_index[row_index], p_column_name, p_value,
                                          uncommitted_updates_visible, p_row_state);
}

kt_int32_t rg_i_get_values_for_packed_index(rg_i_table_t * p_table, kt_uint32_t row_index,
                                            kt_char_ptr_t * p_column_names, kt_value_t ** p_values,
                                            kt_uint32_t total_values, kt_uint32_t uncommitted_updates_visible,
                                            rg_row_state_t * p_row_state)
{
    if (row_index >= p_table->total_applied_rows)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX);
    return rg_i_get_values_for_fixed_index(p_table, p_table->p_rows_packed_index[row_index], p_column_names, p_values,
                                           total_values, uncommitted_updates_visible, p_row_state);
}

kt_int32_t rg_i_get_value_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t p_column_name,
                                  kt_value_t * p_value, kt_uint32_t uncommitted_updates_visible,
                                  rg_row_state_t * p_row_state)
{
    kt_uint32_t fixed_row_index = 0;
    if (const kt_int32_t rc = rg_i_get_fixed_row_index_for_key(p_table, row_key, &fixed_row_index); rc != 0)
        return rc;
    return rg_i_get_value_for_fixed_index(p_table, fixed_row_index, p_column_name, p_value, uncommitted_updates_visible,
                                          p_row_state);
}

kt_int32_t rg_i_get_values_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_char_ptr_t * p_column_names,
                                   kt_value_t ** p_values, kt_uint32_t total_values,
                                   kt_uint32_t uncommitted_updates_visible, rg_row_state_t * p_row_state)
{
    kt_uint32_t fixed_row_index = 0;
    if (const kt_int32_t rc = rg_i_get_fixed_row_index_for_key(p_table, row_key, &fixed_row_index); rc != 0)
        return rc;
    return rg_i_get_values_for_fixed_index(p_table, fixed_row_index, p_column_names, p_values, total_values,
                                           uncommitted_updates_visible, p_row_state);
}

kt_int32_t rg_i_get_fixed_row_index_for_key(rg_i_table_t * p_table, kt_value_t row_key, kt_uint32_t * p_fixed_row_index)
{
    const kt_data_type_t key_type = p_table->p_columns[0].type;
    const bool           indirect = rg_i_type_is_indirect(key_type);
    if (p_fixed_row_index == nullptr || (indirect && row_key.ptr_char == nullptr))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    if (p_table->p_rows_hash_table != nullptr) {
        kt_char_ptr_t    p_key = indirect ? row_key.ptr_char : reinterpret_cast<kt_char_ptr_t>(&row_key);
        const kt_int32_t rc =
            rg_i_hash_table_get_index_and_fetch(p_table->p_rows_hash_table, p_key, p_fixed_row_index,
                                                p_table->p_rows_fixed_index, sizeof(rg_i_index_entry_t));
        if (rc == RG_E_NO_SUCH_KEY) // comes without a record
            trace_key_not_found(RG_HERE, p_table->p_name, row_key, key_type);
        return rc;
    }

    const kt_uint32_t fixed_row_index = find_key(p_table, row_key, key_type);
    if (fixed_row_index == p_table->maximum_rows) {
        trace_key_not_found(RG_HERE, p_table->p_name, row_key, key_type);
        return RG_E_NO_SUCH_KEY;
    }
    *p_fixed_row_index = fixed_row_index;
    return 0;
}

rg_row_state_t rg_i_get_row_state_for_fixed_index(rg_i_table_t * p_table, kt_uint32_t fixed_row_index)
{
    const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[fixed_row_index];
    if (entry.p_applied == nullptr)
        return entry.p_committed == nullptr ? RG_ROW_STATE_NO_ROW : RG_ROW_STATE_DELETED;
    if (entry.p_committed == nullptr)
        return RG_ROW_STATE_ADDED;
    return entry.p_applied == entry.p_committed ? RG_ROW_STATE_COMMITTED : RG_ROW_STATE_UPDATED;
}
