// SPDX-License-Identifier: MIT
// rg_x_get_table_metadata: the exported description of a table, and its release.
//
// Layer: schema, exported. The release takes no lock: a description isn't shared with its table.
#include <cstdlib>

#include "frame/rg_i_call_frame.h"
#include "schema/rg_i_get_table_metadata.h"

namespace
{

constexpr char module_version[] = "rg_x_get_table_metadata 1.0";

[[nodiscard]] kt_int32_t free_metadata(rg_table_metadata_t * p_metadata)
{
    if (p_metadata == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    if (p_metadata->column_definitions != nullptr) {
        rg_i_free_column_metadata(p_metadata->column_definitions, p_metadata->number_of_columns);
        std::free(p_metadata->column_definitions);
    }
    std::free(p_metadata->name);
    std::free(p_metadata);
    return 0;
}

[[nodiscard]] kt_int32_t get_metadata(const rg_i_site_t & site, rg_i_table_t & table, kt_int32_t all_metadata,
                                      rg_table_metadata_t ** p_p_metadata)
{
    if (p_p_metadata == nullptr)
        return rg_i_fail(site, RG_E_NULL_POINTER);
    return rg_i_get_table_metadata(&table, all_metadata, p_p_metadata);
}

} // namespace

extern "C" kt_int32_t rg_get_table_metadata_1(rg_opaque_handle_t table_handle, kt_int32_t all_metadata,
                                              rg_table_metadata_t ** p_p_metadata)
{
    const rg_i_site_t site = RG_HERE;
    return rg_i_reading_call<entry_id::get_table_metadata>(site, table_handle, [&](rg_i_table_t & table) {
        return get_metadata(site, table, all_metadata, p_p_metadata);
    });
}

extern "C" kt_int32_t rg_free_table_metadata_1(rg_table_metadata_t * p_metadata)
{
    rg_i_trace_entry(entry_id::free_table_metadata);
    return rg_i_finish_call(entry_id::free_table_metadata, free_metadata(p_metadata));
}
