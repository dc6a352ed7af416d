// SPDX-License-Identifier: MIT
// rg_i_row_walk: the walk over all rows that have a record in one role, in the order of their fixed indices.
#pragma once

#include <algorithm>
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
    kt_uint32_t   total_slots;
    kt_uint32_t   total_rows;
    kt_uint64_t   rows;   // bit i: the slot at first_slot + i has a record in the role of the walk
    kt_uint64_t   judged; // those of them that have a record to be judged by
    kt_char_ptr_t records[most_slots];
};

// Asks for the first two cache lines of a record, counted from its head. They hold the slots and the first strings of
// most tables. NULL is passed over.
inline void rg_i_fetch_record(const kt_char_t * p_record)
{
    constexpr kt_uint32_t cache_line = 64;
    if (p_record == nullptr)
        return;
    __builtin_prefetch(p_record);
    __builtin_prefetch(p_record + (cache_line - RG_I_RECORD_HEAD_LENGTH));
}

// The rows of some slots, without those behind the most_rows first.
//
// Slots follow each other in memory and records don't: those of the next group are asked for here, one beside each slot,
// so that their coming overlaps with the work on this group. (All at once they would wait for each other.)
[[nodiscard]] inline rg_i_row_group_t rg_i_group_of_rows(const rg_i_table_t * p_table, kt_uint32_t first_slot,
                                                         row_role role, row_role judged_role, kt_uint32_t most_rows)
{
    const rg_i_index_entry_t * const p_slots     = p_table->p_rows_fixed_index + first_slot;
    const kt_uint32_t                slots_left  = p_table->maximum_rows - first_slot;
    const kt_uint32_t                total_slots = std::min(slots_left, rg_i_row_group_t::most_slots);
    rg_i_row_group_t                 group;
    kt_uint32_t                      total_rows = 0;
    kt_uint64_t                      rows = 0, judged = 0, bit = 1;
    for (kt_uint32_t i = 0; i < total_slots; ++i, bit += bit) {
        if (i + total_slots < slots_left)
            rg_i_fetch_record(rg_i_record_in_role(p_slots[i + total_slots], judged_role));
        const bool is_row = rg_i_record_in_role(p_slots[i], role) != nullptr;
        group.records[i]  = rg_i_record_in_role(p_slots[i], judged_role);
        rows |= is_row ? bit : 0;
        judged |= group.records[i] != nullptr ? bit : 0;
        total_rows += is_row ? 1 : 0;
    }
    for (; total_rows > most_rows; --total_rows)
        rows &= ~std::bit_floor(rows);
    group.first_slot  = first_slot;
    group.total_slots = total_slots;
    group.total_rows  = total_rows;
    group.rows        = rows;
    group.judged      = judged & rows;
    return group;
}

// Visits all rows that have a record in the role, group by group, until a visit returns a code other than 0, which is
// the result. A slot without the record is passed over and not counted; the walk ends with the last row, not with the
// last slot.
template <class Visit>
[[nodiscard]] kt_int32_t rg_i_walk_row_groups(const rg_i_table_t * p_table, row_role role, row_role judged_role,
                                              Visit && visit)
{
    kt_uint32_t rows_left = rg_i_rows_in_role(p_table, role);
    for (kt_uint32_t slot = 0; rows_left != 0 && slot < p_table->maximum_rows;) {
        const rg_i_row_group_t group = rg_i_group_of_rows(p_table, slot, role, judged_role, rows_left);
        slot += group.total_slots;
        rows_left -= group.total_rows;
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
