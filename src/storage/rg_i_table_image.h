// SPDX-License-Identifier: MIT
// rg_i_table_image: what a rewrite of a table and a copy of it to a file have in common: which rows go out, and what
// their records look like in a file that holds one version of each row.
#pragma once

#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"

// Offsets and lengths in a file are 32 bits wide, and nobody may write a file that they can't tell.
[[nodiscard]] inline bool rg_i_outgrows_offsets(kt_uint64_t file_length)
{
    return file_length > UINT32_MAX;
}

// Length of a row's record in a file.
[[nodiscard]] inline kt_uint32_t rg_i_disk_length_of(const kt_char_t * p_record_data)
{
    return rg_i_record_head(p_record_data)->record_length - RG_I_MEMORY_RECORD_EXCESS;
}

enum class row_record { keeps_replaces_offset, stands_alone };

// Builds the file form of a row's record. The data begins with the offset of the version that this one replaces; in a
// file with one version of each row nothing is replaced.
inline void rg_i_build_row_record(const kt_char_t * p_record_data, kt_char_ptr_t p_disk_record, row_record form)
{
    const kt_uint32_t type          = rg_i_record_head(p_record_data)->type;
    const kt_uint32_t record_length = rg_i_disk_length_of(p_record_data);
    rg_i_store(p_disk_record, rg_i_disk_record_metadata_t{record_length, 0, type});
    std::memcpy(p_disk_record + sizeof(rg_i_disk_record_metadata_t), p_record_data,
                record_length - sizeof(rg_i_disk_record_metadata_t));
    if (form == row_record::stands_alone && type == RG_RECORD_TYPE_ROW)
        rg_i_store_u32(p_disk_record + offsetof(rg_i_disk_row_record_t, replaces_offset), 0);
}

// Runs an action for the index entry of each row that has an applied record, in ascending fixed index. Stops at the
// first non-zero result.
template <class Table, class Action> [[nodiscard]] kt_int32_t rg_i_for_each_applied_row(Table & table, Action action)
{
    kt_uint32_t rows_to_write = table.total_applied_rows - table.applied_deletions;
    for (kt_uint32_t slot = 0; rows_to_write > 0 && slot < table.maximum_rows; ++slot) {
        auto & entry = table.p_rows_fixed_index[slot];
        if (entry.p_applied == nullptr)
            continue;
        --rows_to_write;
        if (const kt_int32_t rc = action(entry); rc != 0)
            return rc;
    }
    return 0;
}
