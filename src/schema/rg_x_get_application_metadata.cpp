// SPDX-License-Identifier: MIT
// rg_x_get_application_metadata: gives a copy of the application's binary in a table.
//
// Layer: schema, exported. The binary is element type 0 of the table's set.
// Locking: the frame's.
#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_trace.h"
#include "rg_i_application_metadata.h"

namespace
{

constexpr char module_version[] = "rg_x_get_application_metadata 1.0";

constexpr kt_uint32_t the_binary = 0;

// The frame of a call without a place for its result: refused behind the handle, ahead of the table's lock.
[[nodiscard]] kt_int32_t refuse_without_result(const rg_i_site_t & site, rg_opaque_handle_t table_handle)
{
    rg_i_trace_entry(entry_id::get_application_metadata);
    kt_int32_t rc = rg_i_check_handle(site, table_handle);
    if (rc == 0)
        rc = rg_i_fail(site, RG_E_NULL_POINTER);
    return rg_i_finish_call(entry_id::get_application_metadata, rc);
}

} // namespace

extern "C" kt_int32_t rg_get_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t ** p_p_binary)
{
    if (p_p_binary == nullptr)
        return refuse_without_result(RG_HERE, table_handle);
    return rg_i_reading_call<entry_id::get_application_metadata>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_get_application_metadata_element_binary(table.p_application_metadata, the_binary,
                                                            table.uncommitted_updates_visible, p_p_binary);
    });
}
