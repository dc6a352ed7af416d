// SPDX-License-Identifier: MIT
// rg_i_row_walk: the walk over all rows that have a record in one role, in the order of their fixed indices.
#pragma once

#include "rg_i_table.h"

enum class row_role { applied, committed };

[[nodiscard]] inline row_role rg_i_visible_role(kt_uint32_t uncommitted_updates_visible)
{
    return uncommitted_updates_visible != 0 ? row_role::applied : row_role::committed;
}

// Rows that have a record in the role.
[[nodiscard]] inline kt_uint32_t rg_i_rows_in_role(const rg_i_table_t * p_table, row_role role)
{
    return role == row_role::applied ? p_table->total_applied_rows - p_table->applied_deletions
                                     : p_table->total_committed_rows;
}

[[nodiscard]] inline kt_char_ptr_t rg_i_record_in_role(const rg_i_index_entry_t & entry, row_role role)
{
    return role == row_role::applied ? entry.p_applied : entry.p_committed;
}

// Visits each such row with its slot and its record, until a visit returns a code other than 0, which is the result.
// A slot without the record is passed over and not counted; the walk ends with the last row, not with the last slot.
template <class Visit> [[nodiscard]] kt_int32_t rg_i_walk_rows(rg_i_table_t * p_table, row_role role, Visit && visit)
{
    // Slots follow each other in memory and records don't: a few are asked for ahead, so that their coming overlaps.
    constexpr kt_uint32_t ahead = 24;

    const kt_uint32_t total_rows   = rg_i_rows_in_role(p_table, role);
    const kt_uint32_t maximum_rows = p_table->maximum_rows;
    for (kt_uint32_t visited = 0, slot = 0; visited < total_rows && slot < maximum_rows; ++slot) {
        if (slot + ahead < maximum_rows)
            __builtin_prefetch(rg_i_record_in_role(p_table->p_rows_fixed_index[slot + ahead], role));
        kt_char_ptr_t p_record = rg_i_record_in_role(p_table->p_rows_fixed_index[slot], role);
        if (p_record == nullptr)
            continue;
        ++visited;
        if (const kt_int32_t rc = visit(slot, p_record); rc != 0)
            return rc;
    }
    return 0;
}
