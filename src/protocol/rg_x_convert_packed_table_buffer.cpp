// SPDX-License-Identifier: MIT
// rg_x_convert_packed_table_buffer: puts a buffer from a machine of the other byte order into local order, in place.
//
// Layer: protocol, exported. The value library converts what it knows: slots and items. Rows are opaque bytes to it, so
// they are walked here, with the column types that the buffer tells.
// Always holds: nothing in the buffer is believed. Every step is bounded by the length in the header and by the item
// that it works in. The items of the directory share a budget of the bytes that there are, and so do the values of a
// row: a buffer whose items overlap could otherwise be converted many times over.
// Locking: none. A buffer belongs to one caller at a time.
// Failure: a conversion that fails half way leaves the buffer half converted; there is no way back. Nothing stays
// allocated.
#include <algorithm>
#include <cstdlib>

#include "frame/rg_i_call_frame.h"
#include "protocol/rg_i_client_value.h"
#include "protocol/rg_i_packed_format.h"

namespace
{

constexpr char module_version[] = "rg_x_convert_packed_table_buffer 1.0";

[[nodiscard]] kt_int32_t fail_conversion(const rg_i_site_t & site, kt_int32_t result)
{
    return rg_i_fail_library_call(site, "kt_pmsg_convert_pmsg_value", result);
}

// Converts the word of a slot.
[[nodiscard]] kt_int32_t convert_word(kt_char_ptr_t p_slot)
{
    const kt_int32_t result = kt_pmsg_convert_pmsg_value_within_1(p_slot, KT_UINT32, nullptr, 0);
    return result == 0 ? 0 : fail_conversion(RG_HERE, result);
}

// An area of indirect data, and how many of its bytes no item has claimed yet.
struct area_t {
    kt_char_ptr_t p_start;
    kt_uint32_t   length;
    kt_uint32_t   unclaimed;
};

// Converts a slot and its item.
[[nodiscard]] kt_int32_t convert_value(kt_char_ptr_t p_slot, kt_data_type_t type, area_t & area)
{
    const kt_int32_t result = kt_pmsg_convert_pmsg_value_within_1(p_slot, type, area.p_start, area.length);
    if (result != 0)
        return fail_conversion(RG_HERE, result);
    if (!rg_i_type_is_indirect(type))
        return 0;
    const kt_uint32_t item_length = rg_i_load_u32(p_slot + offsetof(kt_pmsg_value_anchor_t, length));
    if (item_length > area.unclaimed)
        return fail_conversion(RG_HERE, KT_PMSG_E_DAMAGED);
    area.unclaimed -= item_length;
    return 0;
}

// What the conversion of rows has to know.
struct row_shape_t {
    kt_uint32_t        total_rows;
    kt_uint32_t        total_columns;
    const kt_array_t * p_columns; // column metadata, with an element a column at least
};

constexpr size_t p_next_length = offsetof(rg_i_record_metadata_t, type) - offsetof(rg_i_record_metadata_t, p_next);

// Converts one row. p_row is the head of its record; its length word is in local order and lies in the row's item, as
// the conversion of the array has found.
[[nodiscard]] kt_int32_t convert_row(kt_char_ptr_t p_row, const row_shape_t & shape)
{
    const kt_uint64_t fixed_length =
        RG_I_RECORD_HEAD_LENGTH + sizeof(kt_uint32_t) + kt_uint64_t{8} * shape.total_columns;
    const kt_uint32_t row_length = rg_i_load_u32(p_row);
    if (row_length < fixed_length)
        return fail_conversion(RG_HERE, KT_PMSG_E_DAMAGED);

    std::memset(p_row + offsetof(rg_i_record_metadata_t, p_next), 0, p_next_length);
    std::reverse(p_row + offsetof(rg_i_record_metadata_t, type),
                 p_row + offsetof(rg_i_record_metadata_t, disk_table_offset));
    rg_i_store_u32(p_row + RG_I_RECORD_HEAD_LENGTH, 0); // replaces_offset

    const auto    indirect_length = static_cast<kt_uint32_t>(row_length - fixed_length);
    area_t        area{p_row + fixed_length, indirect_length, indirect_length};
    kt_char_ptr_t p_slot = p_row + RG_I_RECORD_HEAD_LENGTH + sizeof(kt_uint32_t);
    for (kt_uint32_t column = 0; column < shape.total_columns; ++column, p_slot += sizeof(kt_pmsg_value_t)) {
        const kt_data_type_t type =
            rg_i_client_uint32(rg_i_client_sd(shape.p_columns, column), RG_I_PACKED_COLUMN_TYPE);
        if (const kt_int32_t rc = convert_value(p_slot, type, area); rc != 0)
            return rc;
    }
    return 0;
}

// Converts the rows of a table, whose array is in local order already but for the rows' contents.
//
// Kept because callers depend on it: the count of rows is that of the table's metadata, not that of the array. Rows of
// the array beyond it stay as they are, which happens when rows were chosen more than once.
[[nodiscard]] kt_int32_t convert_rows(kt_char_ptr_t p_row_array, const row_shape_t & shape)
{
    const kt_uint32_t total = std::min(shape.total_rows, rg_i_load_u32(p_row_array));
    for (kt_uint32_t row = 0; row < total; ++row) {
        const kt_uint32_t offset = rg_i_load_u32(p_row_array + offsetof(kt_array_t, elements) + size_t{8} * row);
        if (const kt_int32_t rc = convert_row(p_row_array + offset, shape); rc != 0)
            return rc;
    }
    return 0;
}

// Reads from the converted metadata how many rows and columns there are.
[[nodiscard]] kt_int32_t read_shape(const rg_i_packed_buffer_t & buffer, kt_char_ptr_t p_slot, row_shape_t * p_shape)
{
    owned_client_value value;
    if (const kt_int32_t result = value.read(KT_SD_PTR, p_slot, buffer.p_indirect_data, buffer.indirect_length);
        result != 0)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", result);
    const kt_structured_data_t * p_sd = value.get().ptr_sd;
    if (!rg_i_client_has_element(p_sd, RG_I_PACKED_TABLE_ROWS, KT_UINT32) ||
        !rg_i_client_has_element(p_sd, RG_I_PACKED_TABLE_COLUMNS, KT_UINT32))
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", KT_PMSG_E_DAMAGED);
    p_shape->total_rows    = rg_i_client_uint32(p_sd, RG_I_PACKED_TABLE_ROWS);
    p_shape->total_columns = rg_i_client_uint32(p_sd, RG_I_PACKED_TABLE_COLUMNS);
    return 0;
}

// Whether each column that the rows have tells its type.
[[nodiscard]] bool columns_are_told(const kt_array_t * p_columns, kt_uint32_t total_columns)
{
    if (total_columns > p_columns->element_count)
        return false;
    for (kt_uint32_t column = 0; column < total_columns; ++column)
        if (!rg_i_client_has_element(rg_i_client_sd(p_columns, column), RG_I_PACKED_COLUMN_TYPE, KT_UINT32))
            return false;
    return true;
}

[[nodiscard]] kt_int32_t convert_table(const rg_i_packed_buffer_t & buffer, kt_uint32_t table_index, area_t & area)
{
    kt_char_ptr_t p_table   = buffer.p_buffer + rg_i_packed_table_offset(table_index);
    kt_char_ptr_t p_fixed   = p_table + offsetof(rg_i_packed_table_t, fixed_metadata);
    kt_char_ptr_t p_columns = p_table + offsetof(rg_i_packed_table_t, column_metadata);
    kt_char_ptr_t p_rows    = p_table + offsetof(rg_i_packed_table_t, rows);

    if (const kt_int32_t rc = convert_value(p_table + offsetof(rg_i_packed_table_t, name), KT_CHAR_PTR, area); rc != 0)
        return rc;
    if (const kt_int32_t rc = convert_value(p_fixed, KT_SD_PTR, area); rc != 0)
        return rc;
    row_shape_t shape{};
    if (const kt_int32_t rc = read_shape(buffer, p_fixed, &shape); rc != 0)
        return rc;
    if (const kt_int32_t rc = convert_value(p_columns, KT_SD_PTR_ARRAY, area); rc != 0)
        return rc;
    if (const kt_int32_t rc = convert_value(p_rows, KT_BINARY_PTR_ARRAY, area); rc != 0)
        return rc;
    if (shape.total_rows == 0)
        return 0;

    // A copy, so that rows which lie over the metadata can't change it while they are converted.
    owned_client_value columns;
    if (const kt_int32_t result =
            columns.read(KT_SD_PTR_ARRAY, p_columns, buffer.p_indirect_data, buffer.indirect_length);
        result != 0)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", result);
    shape.p_columns = columns.get().ptr_array;
    if (!columns_are_told(shape.p_columns, shape.total_columns))
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", KT_PMSG_E_DAMAGED);
    return convert_rows(buffer.p_indirect_data + rg_i_load_u32(p_rows), shape);
}

// Converts everything behind the header, which is in local order.
[[nodiscard]] kt_int32_t convert_body(kt_char_ptr_t p_buffer)
{
    if (rg_i_load_u32(p_buffer) < RG_I_PACKED_DIRECTORY_OFFSET)
        return fail_conversion(RG_HERE, KT_PMSG_E_DAMAGED);
    if (const kt_int32_t rc = convert_word(p_buffer + RG_I_PACKED_TOTAL_TABLES_OFFSET); rc != 0)
        return rc;
    rg_i_packed_buffer_t buffer{};
    if (!rg_i_look_into_packed_buffer(p_buffer, &buffer))
        return fail_conversion(RG_HERE, KT_PMSG_E_DAMAGED);

    area_t area{buffer.p_indirect_data, buffer.indirect_length, buffer.indirect_length};
    for (kt_uint32_t table = 0; table < buffer.total_tables; ++table)
        if (const kt_int32_t rc = convert_table(buffer, table, area); rc != 0)
            return rc;
    return 0;
}

[[nodiscard]] kt_int32_t convert_buffer(void * p_buffer, kt_uint32_t header_already_converted, kt_int32_t do_conversion)
{
    if (p_buffer == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    kt_int32_t verdict = do_conversion;
    if (header_already_converted == 0)
        if (const kt_int32_t result = kt_pmsg_cnv_required_1(static_cast<kt_pmsg_header_t *>(p_buffer), &verdict);
            result != 0)
            return rg_i_fail_library_call(RG_HERE, "kt_pmsg_cnv_required", result);
    if (verdict == 0)
        return 0;

    // From here on the buffer is a local one, also for a caller who has dealt with the rest of the header: another call
    // that looks at the header finds nothing to do.
    auto * p_bytes                                          = static_cast<kt_char_ptr_t>(p_buffer);
    p_bytes[offsetof(kt_pmsg_header_t, kt_pmsg_arch_props)] = RG_I_PACKED_LOCAL_ARCH_PROPS;
    return convert_body(p_bytes);
}

} // namespace

extern "C" kt_int32_t rg_convert_packed_table_buffer_1(void * p_buffer, kt_uint32_t header_already_converted,
                                                       kt_int32_t do_conversion)
{
    rg_i_trace_entry(entry_id::convert_packed_table_buffer);
    return rg_i_finish_call(entry_id::convert_packed_table_buffer,
                            convert_buffer(p_buffer, header_already_converted, do_conversion));
}
