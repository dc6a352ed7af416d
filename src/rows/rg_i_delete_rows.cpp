// SPDX-License-Identifier: MIT
// rg_i_delete_rows: marks rows as gone in the table's pending state.
//
// Layer: rows. Stands on the change lists, the record pool, the hash table and the criteria.
// Always holds: until commit the row keeps its slot, its packed position, its hash element and its committed record;
// what goes at once is an applied record that isn't the committed one. So packed positions stay put while a caller
// deletes one row after the other.
// Locking: the caller holds the table's write lock.
// Failure: a row that can't be deleted is untouched; rows that the same call deleted ahead of it stay deleted.
#include <cstring>

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "rows/rg_i_criteria.h"
#include "rows/rg_i_row_walk.h"

namespace
{

constexpr char module_version[] = "rg_i_delete_rows 1.0";

// Makes the hash element of a row that was never committed independent of the row's record, which is about to go back
// to the pool: until commit or abort a lookup still finds the key, and an add of it revives the slot.
[[nodiscard]] kt_int32_t keep_key_of_added_row(rg_i_table_t * p_table, rg_i_index_entry_t * p_index_entry)
{
    if (p_table->p_rows_hash_table == nullptr || p_index_entry->p_committed != nullptr)
        return 0;
    rg_hash_table_element_t * p_element = p_index_entry->p_hash_table_element;
    const kt_uint32_t         length    = rg_i_key_length(p_table->p_columns[0].type, p_element->p_key_value);
    if (const kt_int32_t rc =
            rg_i_hash_table_own_key(p_table->p_rows_hash_table, p_index_entry->hash_index, length, &p_element);
        rc != 0)
        return rc;
    p_index_entry->p_hash_table_element = p_element;
    return 0;
}

} // namespace

kt_int32_t rg_i_delete_row(rg_i_table_t * p_table, rg_i_index_entry_t * p_current_index_entry)
{
    if (p_current_index_entry->p_applied == nullptr)
        return rg_i_fail(RG_HERE, RG_E_ROW_DELETED);
    if (const kt_int32_t rc = keep_key_of_added_row(p_table, p_current_index_entry); rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_common_add_change_entry(p_table, p_current_index_entry, 1); rc != 0)
        return rc;

    // Nothing below fails.
    if (p_current_index_entry->p_applied != p_current_index_entry->p_committed)
        rg_i_rb_free_record(&p_table->record_buffer_pool, p_current_index_entry->p_applied);
    p_current_index_entry->p_applied = nullptr;
    ++p_table->applied_deletions;
    return 0;
}

kt_int32_t rg_i_delete_rows(rg_i_table_t * p_table, kt_char_ptr_t p_selection_criteria)
{
    if (p_table->ready_for_commit != 0)
        return rg_i_fail(RG_HERE, RG_E_APPLIED_UNCOMMITTED);
    if (rg_i_rows_in_role(p_table, row_role::applied) == 0)
        return rg_i_fail(RG_HERE, RG_E_NO_ROWS_TO_DELETE);
    rg_i_criteria criteria;
    if (const kt_int32_t rc = criteria.compile(p_selection_criteria, p_table); rc != 0)
        return rc;
    return rg_i_walk_matching_rows(
        p_table, row_role::applied, row_role::applied, criteria,
        [&](kt_uint32_t slot, kt_char_ptr_t) { return rg_i_delete_row(p_table, &p_table->p_rows_fixed_index[slot]); });
}
