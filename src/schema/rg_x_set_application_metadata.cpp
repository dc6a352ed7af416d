// SPDX-License-Identifier: MIT
// rg_x_set_application_metadata: gives a table a new version of the application's binary.
//
// Layer: schema, exported. The binary is element type 0 of the table's set; it is applied, committed and aborted with
// the rows.
// Locking: the frame's.
#include "frame/rg_i_call_frame.h"
#include "frame/rg_i_trace.h"
#include "rg_i_application_metadata.h"

namespace
{

constexpr char module_version[] = "rg_x_set_application_metadata 1.0";

constexpr kt_uint32_t the_binary = 0;

// The frame of a call without a binary: refused behind the handle, ahead of the table's lock and mode.
[[nodiscard]] kt_int32_t refuse_without_binary(const rg_i_site_t & site, rg_opaque_handle_t table_handle)
{
    return rg_i_exclusive_call<entry_id::set_application_metadata>([&]() -> kt_int32_t {
        if (const kt_int32_t rc = rg_i_check_handle(site, table_handle); rc != 0)
            return rc;
        return rg_i_fail(site, RG_E_NULL_POINTER);
    });
}

} // namespace

// Kept because callers depend on it: whether an apply is outstanding isn't tested here. An implicit apply reports it.
extern "C" kt_int32_t rg_set_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t * p_binary)
{
    if (p_binary == nullptr)
        return refuse_without_binary(RG_HERE, table_handle);
    return rg_i_updating_call<entry_id::set_application_metadata>(RG_HERE, table_handle, [&](rg_i_table_t & table) {
        return rg_i_set_application_metadata(table.p_application_metadata, the_binary, p_binary->length,
                                             reinterpret_cast<kt_char_ptr_t>(p_binary->data));
    });
}
