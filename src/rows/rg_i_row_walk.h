// SPDX-License-Identifier: MIT
// rg_i_row_walk: the walk over all rows that have a record in one role, in the order of their fixed indices.
#pragma once

#include <bit>

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

// Rows whose slots follow each other, and of each the record that it is judged by.
struct rg_i_row_group_t {
    static constexpr kt_uint32_t most_slots = 64;

    kt_uint32_t   first_slot;
    kt_uint64_t   rows;   // bit i: the slot at first_slot + i has a record in the role of the walk
    kt_uint64_t   judged; // those of them that have a record to be judged by
    kt_char_ptr_t records[most_slots];
};

// Visits all rows that have a record in the role, group by group, until a visit returns a code other than 0, which is
// the result. A slot without the record is passed over and not counted; the walk ends with the last row, not with the
// last slot.
template <class Visit>
[[nodiscard]] kt_int32_t rg_i_walk_row_groups(const rg_i_table_t * p_table, row_role role, row_role judged_role,
                                              Visit && visit)
{
    // Slots follow each other in memory and records don't: they are asked for a group ahead, so that their coming
    // overlaps with the work on this one.
    constexpr kt_uint32_t ahead = rg_i_row_group_t::most_slots;

    const kt_uint32_t          total_rows   = rg_i_rows_in_role(p_table, role);
    const kt_uint32_t          maximum_rows = p_table->maximum_rows;
    const rg_i_index_entry_t * p_slots      = p_table->p_rows_fixed_index;
    rg_i_row_group_t           group;
    for (kt_uint32_t visited = 0, slot = 0; visited < total_rows && slot < maximum_rows;) {
        group.first_slot      = slot;
        group.rows            = 0;
        group.judged          = 0;
        const kt_uint32_t end = maximum_rows - slot > group.most_slots ? slot + group.most_slots : maximum_rows;
        for (kt_uint32_t i = 0; slot < end && visited < total_rows; ++slot, ++i) {
            if (maximum_rows - slot > ahead)
                __builtin_prefetch(rg_i_record_in_role(p_slots[slot + ahead], judged_role));
            const kt_uint64_t   is_row   = rg_i_record_in_role(p_slots[slot], role) != nullptr ? 1 : 0;
            const kt_char_ptr_t p_judged = rg_i_record_in_role(p_slots[slot], judged_role);
            group.records[i]             = p_judged;
            group.rows |= is_row << i;
            group.judged |= (p_judged != nullptr ? is_row : 0) << i;
            visited += static_cast<kt_uint32_t>(is_row);
        }
        if (group.rows != 0)
            if (const kt_int32_t rc = visit(group); rc != 0)
                return rc;
    }
    return 0;
}

// Visits each row of the group that is in the set, with its slot and its record, in the order of the slots.
template <class Visit>
[[nodiscard]] kt_int32_t rg_i_visit_rows(const rg_i_row_group_t & group, kt_uint64_t set, Visit && visit)
{
    for (; set != 0; set &= set - 1) {
        const auto i = static_cast<kt_uint32_t>(std::countr_zero(set));
        if (const kt_int32_t rc = visit(group.first_slot + i, group.records[i]); rc != 0)
            return rc;
    }
    return 0;
}

// Visits each row that has a record in the role with its slot and that record.
template <class Visit>
[[nodiscard]] kt_int32_t rg_i_walk_rows(const rg_i_table_t * p_table, row_role role, Visit && visit)
{
    return rg_i_walk_row_groups(
        p_table, role, role, [&](const rg_i_row_group_t & group) { return rg_i_visit_rows(group, group.rows, visit); });
}
