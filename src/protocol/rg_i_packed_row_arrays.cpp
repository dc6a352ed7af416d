// SPDX-License-Identifier: MIT
// rg_i_packed_row_arrays: a table's rows, presented as an array of binaries for packing.
//
// Layer: protocol. Called by packing.
// Always holds: nothing of a row is copied here. An element points at the head of a row's record, whose length word
// serves as the binary's length; since that word counts itself, packing reads RG_I_RECORD_OVERHANG bytes behind the
// record.
// Locking: the caller holds the table's read lock.
// Failure: nothing stays allocated.
#include <algorithm>
#include <cstdlib>

#include "frame/rg_i_trace.h"
#include "protocol/rg_x_protocol.h"

namespace
{

constexpr char module_version[] = "rg_i_packed_row_arrays 1.0";

[[nodiscard]] kt_array_ptr_t new_row_array(kt_uint32_t element_count)
{
    const size_t length  = offsetof(kt_array_t, elements) + size_t{element_count} * sizeof(kt_value_t);
    auto *       p_array = static_cast<kt_array_ptr_t>(std::malloc(std::max(length, sizeof(kt_array_t))));
    if (p_array != nullptr) {
        p_array->element_count = element_count;
        p_array->pad           = 0;
    }
    return p_array;
}

// The record in the role asked for, or NULL.
[[nodiscard]] kt_char_ptr_t record_in_role(const rg_i_index_entry_t & entry, kt_uint32_t uncommitted_updates_visible)
{
    return uncommitted_updates_visible != 0 ? entry.p_applied : entry.p_committed;
}

[[nodiscard]] kt_value_t as_binary(kt_char_ptr_t p_record_data)
{
    kt_value_t value;
    value.ptr_binary = reinterpret_cast<kt_binary_ptr_t>(p_record_data - RG_I_RECORD_HEAD_LENGTH);
    return value;
}

} // namespace

kt_int32_t rg_i_get_table_row_array(rg_i_table_t * p_table, kt_uint32_t uncommitted_updates_visible,
                                    kt_array_ptr_t * p_row_array)
{
    const kt_uint32_t total_rows =
        uncommitted_updates_visible != 0 ? p_table->total_applied_rows : p_table->total_committed_rows;
    kt_array_ptr_t p_array = new_row_array(total_rows);
    if (p_array == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    // A row without a record in this role counts among the rows and isn't packed: one whose deletion is pending, or
    // which isn't committed yet.
    kt_value_t * p_elements = p_array->elements;
    kt_uint32_t  packed     = 0;
    for (kt_uint32_t slot = 0; packed < total_rows && slot < p_table->maximum_rows; ++slot)
        if (kt_char_ptr_t p_record = record_in_role(p_table->p_rows_fixed_index[slot], uncommitted_updates_visible);
            p_record != nullptr)
            p_elements[packed++] = as_binary(p_record);
    p_array->element_count = packed;
    *p_row_array           = p_array;
    return 0;
}

kt_int32_t rg_i_get_table_row_array_by_fixed_index(rg_i_table_t * p_table, kt_uint32_t uncommitted_updates_visible,
                                                   kt_uint32_t   total_row_fixed_indices,
                                                   kt_uint32_t * p_row_fixed_indices, kt_array_ptr_t * p_row_array)
{
    kt_array_ptr_t p_array = new_row_array(total_row_fixed_indices);
    if (p_array == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    kt_value_t * p_elements = p_array->elements;
    for (kt_uint32_t i = 0; i < total_row_fixed_indices; ++i) {
        const kt_uint32_t slot     = p_row_fixed_indices[i];
        kt_char_ptr_t     p_record = slot < p_table->maximum_rows
                                         ? record_in_role(p_table->p_rows_fixed_index[slot], uncommitted_updates_visible)
                                         : nullptr;
        if (p_record == nullptr) {
            std::free(p_array);
            return rg_i_fail(RG_HERE, RG_E_ROW_DELETED);
        }
        p_elements[i] = as_binary(p_record);
    }
    *p_row_array = p_array;
    return 0;
}
