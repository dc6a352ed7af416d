// SPDX-License-Identifier: MIT
// rg_x_get_packed_tables: how many tables a buffer holds, and their names.
//
// Layer: protocol, exported. The buffer is in local order: conversion comes first, and nothing here tests for it.
// Always holds: nothing beyond the length in the header is read.
// Locking: none. Failure: the result is untouched.
#include "frame/rg_i_call_frame.h"
#include "protocol/rg_i_packed_format.h"
#include "protocol/rg_x_protocol.h"

namespace
{

constexpr char module_version[] = "rg_x_get_packed_tables 1.0";

constexpr kt_char_t reading_operation[] = "kt_pmsg_build_conv_packed_client_value";

[[nodiscard]] kt_int32_t get_total_packed_tables(void * p_buffer, kt_uint32_t * p_total_packed_tables)
{
    if (p_total_packed_tables == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_packed_buffer_t buffer{};
    if (const kt_int32_t rc = rg_i_open_packed_buffer(p_buffer, &buffer); rc != 0)
        return rc;
    *p_total_packed_tables = buffer.total_tables;
    return 0;
}

[[nodiscard]] kt_int32_t get_packed_table_name(void * p_buffer, kt_uint32_t table_index, kt_char_ptr_t * p_table_name)
{
    if (p_table_name == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_packed_buffer_t buffer{};
    if (const kt_int32_t rc = rg_i_open_packed_buffer(p_buffer, &buffer); rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_check_packed_table_index(buffer, table_index); rc != 0)
        return rc;

    kt_pmsg_value_anchor_t anchor;
    std::memcpy(&anchor, buffer.p_buffer + rg_i_packed_table_offset(table_index), sizeof anchor);
    if (kt_uint64_t{anchor.offset} + anchor.length > buffer.indirect_length)
        return rg_i_fail_library_call(RG_HERE, reading_operation, KT_PMSG_E_DAMAGED);
    kt_char_ptr_t p_name = buffer.p_indirect_data + anchor.offset;
    // The name is handed out as a string, so its end must lie in the buffer.
    if (std::memchr(p_name, '\0', buffer.indirect_length - anchor.offset) == nullptr)
        return rg_i_fail_library_call(RG_HERE, reading_operation, KT_PMSG_E_DAMAGED);
    *p_table_name = p_name;
    return 0;
}

} // namespace

kt_int32_t rg_i_open_packed_buffer(void * p_buffer, rg_i_packed_buffer_t * p_look)
{
    if (p_buffer == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (!rg_i_look_into_packed_buffer(p_buffer, p_look))
        return rg_i_fail_library_call(RG_HERE, reading_operation, KT_PMSG_E_DAMAGED);
    return 0;
}

kt_int32_t rg_i_check_packed_table_index(const rg_i_packed_buffer_t & buffer, kt_uint32_t table_index)
{
    // Kept because callers depend on it: the sum is 32 bits wide, so 0xFFFFFFFF passes.
    const kt_uint32_t tables_needed = table_index + 1;
    return tables_needed > buffer.total_tables ? rg_i_fail(RG_HERE, RG_E_NO_SUCH_INDEX) : 0;
}

extern "C" kt_int32_t rg_get_total_packed_tables_1(void * p_buffer, kt_uint32_t * p_total_packed_tables)
{
    rg_i_trace_entry(entry_id::get_total_packed_tables);
    return rg_i_finish_call(entry_id::get_total_packed_tables,
                            get_total_packed_tables(p_buffer, p_total_packed_tables));
}

extern "C" kt_int32_t rg_get_packed_table_name_1(void * p_buffer, kt_uint32_t table_index, kt_char_ptr_t * p_table_name)
{
    rg_i_trace_entry(entry_id::get_packed_table_name);
    return rg_i_finish_call(entry_id::get_packed_table_name,
                            get_packed_table_name(p_buffer, table_index, p_table_name));
}
