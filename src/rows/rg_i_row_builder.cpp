// SPDX-License-Identifier: MIT
// rg_i_row_builder: see rg_i_row_builder.h.
//
// Layer: rows. Stands on the record pool and the value library.
// Always holds: every byte that is taken is written here, so that the room that is lent needn't be zeroed and a record
// costs the same whatever free record it is built in. Nothing behind the record so far has been written: a value that
// the value library refuses, or has no room for, leaves no byte behind.
// Locking: the caller holds the table's write lock, from opening to taking or abandoning.
// Failure: the record stays to be abandoned by whoever opened it; only a failed opening leaves nothing.
#include "rows/rg_i_row_builder.h"

#include <cstring>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_row_builder 1.0";

[[nodiscard]] kt_char_ptr_t indirect_data(const rg_i_row_builder_t & row)
{
    return row.p_record + row.fixed_length;
}

[[nodiscard]] kt_uint32_t length_so_far(const rg_i_row_builder_t & row)
{
    return row.fixed_length + row.running_offset;
}

// Moves the record to lent room of so many bytes at least.
[[nodiscard]] kt_int32_t acquire_row_record(rg_i_row_builder_t & row, kt_uint32_t wanted_length)
{
    rg_i_record_buffer_pool_t * p_pool                 = &row.p_table->record_buffer_pool;
    kt_char_ptr_t               p_room                 = nullptr;
    kt_char_ptr_t               p_previous_free_record = nullptr;
    kt_uint32_t                 capacity               = 0;
    if (const kt_int32_t rc = rg_i_rb_lend_record(p_pool, wanted_length, &p_room, &p_previous_free_record, &capacity);
        rc != 0)
        return rc;

    if (row.p_record != nullptr && row.p_record != p_room) {
        std::memcpy(p_room, row.p_record, length_so_far(row));
        rg_i_rb_give_back_record(p_pool, row.p_record, length_so_far(row));
    }
    row.p_record               = p_room;
    row.p_previous_free_record = p_previous_free_record;
    row.capacity               = capacity;
    return 0;
}

[[nodiscard]] kt_int32_t acquire_doubled_row_record(rg_i_row_builder_t & row)
{
    if (row.capacity > UINT32_MAX / 2)
        return rg_i_fail_no_memory(RG_HERE); // the record would be longer than a length can say
    return acquire_row_record(row, 2 * row.capacity);
}

[[nodiscard]] kt_int32_t acquire_longer_row_record(rg_i_row_builder_t & row, kt_uint32_t length)
{
    if (length > UINT32_MAX - row.capacity)
        return rg_i_fail_no_memory(RG_HERE);
    return acquire_row_record(row, row.capacity + length);
}

} // namespace

kt_int32_t rg_i_row_builder_open(rg_i_row_builder_t * p_row, rg_i_table_t * p_table, kt_uint32_t wanted_length)
{
    *p_row         = {};
    p_row->p_table = p_table;
    p_row->p_string_conversion_handle =
        p_table->p_tree != nullptr ? p_table->p_tree->p_to_table_string_conversion_handle : nullptr;
    p_row->fixed_length = rg_i_row_fixed_length(p_table->total_columns);
    return acquire_row_record(*p_row, wanted_length);
}

kt_int32_t rg_i_row_builder_store_indirect(rg_i_row_builder_t * p_row, kt_uint32_t column, kt_value_t * p_client_value)
{
    rg_i_row_builder_t & row  = *p_row;
    const kt_data_type_t type = row.p_table->p_columns[column].type;
    kt_value_t           value;
    rg_i_dup_nonscalar_value(type, p_client_value, &value);
    for (;;) {
        const kt_int32_t result = kt_pmsg_build_conv_protocol_value_1(
            row.p_string_conversion_handle, 0, type, &value, rg_i_row_slot(row.p_record, column), indirect_data(row),
            row.capacity - row.fixed_length, &row.running_offset);
        if (result == 0)
            return 0;
        if (result != KT_PMSG_E_NO_ROOM)
            return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_protocol_value", result);
        if (const kt_int32_t rc = acquire_doubled_row_record(row); rc != 0)
            return rc;
    }
}

kt_int32_t rg_i_row_builder_carry_indirect(rg_i_row_builder_t * p_row, kt_uint32_t column, const void * p_slot,
                                           const kt_char_t * p_indirect_data, kt_uint32_t indirect_length,
                                           room_grows growth)
{
    rg_i_row_builder_t &   row = *p_row;
    kt_pmsg_value_anchor_t anchor;
    std::memcpy(&anchor, p_slot, sizeof anchor);
    if (anchor.offset > indirect_length || anchor.length > indirect_length - anchor.offset)
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    while (anchor.length > row.capacity - length_so_far(row)) {
        const kt_int32_t rc = growth == room_grows::by_doubling ? acquire_doubled_row_record(row)
                                                                : acquire_longer_row_record(row, anchor.length);
        if (rc != 0)
            return rc;
    }
    std::memcpy(indirect_data(row) + row.running_offset, p_indirect_data + anchor.offset, anchor.length);
    anchor.offset = row.running_offset;
    row.running_offset += anchor.length;
    std::memcpy(rg_i_row_slot(row.p_record, column), &anchor, sizeof anchor);
    return 0;
}

kt_int32_t rg_i_row_builder_take(rg_i_row_builder_t * p_row, kt_uint32_t replaces_offset)
{
    rg_i_store_u32(p_row->p_record, replaces_offset);
    return rg_i_rb_take_record(&p_row->p_table->record_buffer_pool, p_row->p_record, p_row->p_previous_free_record,
                               length_so_far(*p_row), RG_RECORD_TYPE_ROW);
}

void rg_i_row_builder_abandon(rg_i_row_builder_t * p_row)
{
    rg_i_rb_give_back_record(&p_row->p_table->record_buffer_pool, p_row->p_record, length_so_far(*p_row));
}
