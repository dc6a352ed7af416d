// SPDX-License-Identifier: MIT
// rg_i_swap_contents: exchanges the contents of two table objects, so that the handles on one of them show the other's.
//
// Layer: storage. Called where a reader becomes a writer, and by whole copies and column changes.
// Always holds: exactly the fields told below change places. The packed index stays with its object, and is made to fit
// the slots that it addresses from now on. Nothing pending survives: change entries hold addresses of slots.
// The object given as the new one is good for closing afterwards.
// Locking: the caller holds the write lock of p_table; no other thread can see p_new_table.
// Failure: only memory can run out, before anything is exchanged.
#include <algorithm>
#include <cstdlib>
#include <utility>

#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "table/rg_i_key_index.h"

namespace
{

constexpr char module_version[] = "rg_i_swap_contents 1.0";

[[nodiscard]] kt_int32_t grow_packed_index(rg_i_table_t & table, kt_uint32_t maximum_rows)
{
    if (maximum_rows <= table.maximum_rows)
        return 0;
    void * p_grown = std::realloc(table.p_rows_packed_index, maximum_rows * sizeof(kt_uint32_t));
    if (p_grown == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    table.p_rows_packed_index = static_cast<kt_uint32_t *>(p_grown);
    return 0;
}

// Fits the kept packed index to new slots. What stands in it for the rows there were stays, but for entries that name
// no slot any more; the positions behind those rows hold their own number, which is right for rows just opened.
void fit_packed_index(const rg_i_table_t & table, kt_uint32_t new_maximum_rows)
{
    const kt_uint32_t kept = std::min(table.total_applied_rows, std::min(table.maximum_rows, new_maximum_rows));
    for (kt_uint32_t i = 0; i < kept; ++i)
        if (table.p_rows_packed_index[i] >= new_maximum_rows)
            table.p_rows_packed_index[i] = i;
    for (kt_uint32_t i = kept; i < new_maximum_rows; ++i)
        table.p_rows_packed_index[i] = i;
}

void forget_entries(const rg_i_change_entry_t * p_change)
{
    for (; p_change != nullptr; p_change = p_change->p_next)
        p_change->p_index_entry->p_pending_change = nullptr;
}

void drop_pending(rg_i_table_t & table)
{
    forget_entries(table.p_rows_change_list);
    forget_entries(table.p_delete_rows_change_list);
    rg_i_free_change_lists(&table);
    table.applied_deletions = 0;
    table.ready_for_commit  = 0;
}

// Kept because callers depend on it: this set and no other. Among what stays with its object are the packed index, the
// five disk_ figures and the application metadata.
void exchange_fields(rg_i_table_t & a, rg_i_table_t & b)
{
    std::swap(a.p_metadata_record_data, b.p_metadata_record_data);
    std::swap(a.p_columns, b.p_columns);
    std::swap(a.total_columns, b.total_columns);
    std::swap(a.total_variable_length_columns, b.total_variable_length_columns);

    std::swap(a.maximum_rows, b.maximum_rows);
    std::swap(a.total_applied_rows, b.total_applied_rows);
    std::swap(a.total_committed_rows, b.total_committed_rows);
    std::swap(a.p_rows_fixed_index, b.p_rows_fixed_index);
    std::swap(a.p_rows_hash_table, b.p_rows_hash_table);
    std::swap(a.p_rows_free_chain, b.p_rows_free_chain);
    std::swap(a.record_buffer_pool, b.record_buffer_pool);

    std::swap(a.change_counter, b.change_counter);
    std::swap(a.uncommitted_updates_visible, b.uncommitted_updates_visible);

    std::swap(a.commit_record_offset, b.commit_record_offset);
    std::swap(a.applied_commit_record_offset, b.applied_commit_record_offset);
    std::swap(a.commit_record_length, b.commit_record_length);
    std::swap(a.applied_commit_record_length, b.applied_commit_record_length);
    std::swap(a.file_length, b.file_length);
    std::swap(a.rewrite_file_length, b.rewrite_file_length);
    std::swap(a.file_fd, b.file_fd);
    std::swap(a.rewrite_file_fd, b.rewrite_file_fd);
}

} // namespace

kt_int32_t rg_i_make_room_for_swap(rg_i_table_t * p_table, const rg_i_table_t * p_new_table)
{
    return grow_packed_index(*p_table, p_new_table->maximum_rows);
}

void rg_i_swap_with_room(rg_i_table_t * p_table, rg_i_table_t * p_new_table)
{
    fit_packed_index(*p_table, p_new_table->maximum_rows);
    drop_pending(*p_table);
    drop_pending(*p_new_table);
    rg_i_key_index_drop(p_table);
    rg_i_key_index_drop(p_new_table);
    exchange_fields(*p_table, *p_new_table);
}

kt_int32_t rg_i_swap_after_metadata_update(rg_i_table_t * p_table, rg_i_table_t * p_new_table)
{
    if (const kt_int32_t rc = rg_i_make_room_for_swap(p_table, p_new_table); rc != 0)
        return rc;
    rg_i_swap_with_room(p_table, p_new_table);
    return 0;
}
