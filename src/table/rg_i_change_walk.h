// SPDX-License-Identifier: MIT
// rg_i_change_walk: goes along a change list, and has what the next rows lead to fetched meanwhile.
//
// In a big transaction slots, records and hash elements lie anywhere in memory. One after the other, each would be
// waited for; so a first look ahead fetches the slots, and a second one, closer by, what the slots lead to.
#pragma once

#include "rg_i_table.h"

inline constexpr kt_uint32_t RG_I_ROWS_AHEAD = 8; // of the second look; the first is as far ahead of it

inline void rg_i_fetch_slot(const rg_i_change_entry_t & change)
{
    const auto * const p_slot = reinterpret_cast<const kt_char_t *>(change.p_index_entry);
    __builtin_prefetch(p_slot);
    __builtin_prefetch(p_slot + sizeof(rg_i_index_entry_t) - 1);
}

inline void rg_i_fetch_row(const rg_hash_table_t * p_hash_table, const rg_i_index_entry_t & entry)
{
    if (entry.p_applied != nullptr)
        __builtin_prefetch(rg_i_record_head(entry.p_applied));
    if (entry.p_committed != nullptr && entry.p_committed != entry.p_applied)
        __builtin_prefetch(rg_i_record_head(entry.p_committed));
    if (p_hash_table != nullptr && entry.p_hash_table_element != nullptr) {
        __builtin_prefetch(entry.p_hash_table_element);
        __builtin_prefetch(&p_hash_table->p_elements[entry.hash_index]);
    }
}

// Runs an action for the index entry of each change, in the order of the list. Stops at the first non-zero result. The
// action may free the slot.
template <class Action>
[[nodiscard]] kt_int32_t rg_i_for_each_change(const rg_i_table_t & table, rg_i_change_entry_t * p_first, Action action)
{
    const rg_i_change_entry_t * p_far  = p_first; // its slot is fetched next
    const rg_i_change_entry_t * p_near = p_first; // its row is fetched next
    const auto                  look   = [&] {
        if (p_far != nullptr) {
            rg_i_fetch_slot(*p_far);
            p_far = p_far->p_next;
        }
    };
    const auto look_closer = [&] {
        if (p_near != nullptr) {
            rg_i_fetch_row(table.p_rows_hash_table, *p_near->p_index_entry);
            p_near = p_near->p_next;
        }
    };
    for (kt_uint32_t i = 0; i < 2 * RG_I_ROWS_AHEAD; ++i)
        look();
    for (kt_uint32_t i = 0; i < RG_I_ROWS_AHEAD; ++i)
        look_closer();
    for (rg_i_change_entry_t * p_change = p_first; p_change != nullptr; p_change = p_change->p_next) {
        look();
        look_closer();
        if (const kt_int32_t rc = action(*p_change->p_index_entry); rc != 0)
            return rc;
    }
    return 0;
}
