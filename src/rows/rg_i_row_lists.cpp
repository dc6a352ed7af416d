// SPDX-License-Identifier: MIT
// rg_i_row_lists: lists of fixed indices: the rows that match criteria, that have pending changes, that have a key.
//
// Layer: rows. Stands on the criteria, the hash table and the comparison of keys.
// Always holds: a list is one allocation, the caller's to free, also when it is empty. Nothing in the table changes.
// Locking: the caller holds the table's lock for reading; the indices stay good until a commit or abort frees slots.
// Failure: nothing is delivered.
#include "rows/rg_i_row_lists.h"

#include <cstdlib>

#include "frame/rg_i_trace.h"
#include "rows/rg_i_criteria.h"
#include "rows/rg_i_row_walk.h"

namespace
{

constexpr char module_version[] = "rg_i_row_lists 1.0";

constexpr kt_uint32_t first_capacity = 10;

// A list that grows as it is filled.
struct row_list_t {
    owned_ptr<kt_uint32_t> rows;
    kt_uint32_t            total    = 0;
    kt_uint32_t            capacity = 0;

    [[nodiscard]] kt_int32_t grow(kt_uint32_t new_capacity)
    {
        auto * p_grown = static_cast<kt_uint32_t *>(
            std::realloc(rows.get(), static_cast<size_t>(new_capacity) * sizeof(kt_uint32_t)));
        if (p_grown == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
        (void)rows.release();
        rows.reset(p_grown);
        capacity = new_capacity;
        return 0;
    }

    [[nodiscard]] kt_int32_t append(kt_uint32_t fixed_row_index)
    {
        if (total == capacity)
            if (const kt_int32_t rc = grow(capacity == 0 ? first_capacity : 2 * capacity); rc != 0)
                return rc;
        rows.get()[total++] = fixed_row_index;
        return 0;
    }
};

[[nodiscard]] kt_uint32_t length_of(const rg_i_change_entry_t * p_entry)
{
    kt_uint32_t length = 0;
    for (; p_entry != nullptr; p_entry = p_entry->p_next)
        ++length;
    return length;
}

void append_all(const rg_i_table_t * p_table, const rg_i_change_entry_t * p_entry, row_list_t * p_list)
{
    for (; p_entry != nullptr; p_entry = p_entry->p_next)
        p_list->rows.get()[p_list->total++] = rg_i_fixed_row_index(p_table, p_entry->p_index_entry);
}

// The whole bucket in its order: the row added last comes first.
[[nodiscard]] kt_int32_t list_bucket(const rg_i_table_t * p_table, kt_char_ptr_t p_key, row_role role,
                                     row_list_t * p_list)
{
    const rg_hash_table_t * p_hash_table = p_table->p_rows_hash_table;
    const kt_uint32_t       bucket       = rg_i_hash_table_bucket(p_hash_table, p_key);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);
    for (const rg_hash_table_element_t * p_element = p_hash_table->p_elements[bucket]; p_element != nullptr;
         p_element                                 = p_element->p_next) {
        if (p_hash_table->p_compare_function(p_element->p_key_value, p_key) != 0)
            continue;
        if (rg_i_record_in_role(p_table->p_rows_fixed_index[p_element->row_index], role) == nullptr)
            continue;
        if (const kt_int32_t rc = p_list->append(p_element->row_index); rc != 0)
            return rc;
    }
    return 0;
}

[[nodiscard]] kt_int32_t list_by_scan(rg_i_table_t * p_table, const kt_value_t & key_value, row_role role,
                                      row_list_t * p_list)
{
    const kt_data_type_t key_type = p_table->p_columns[0].type;
    return rg_i_walk_rows(p_table, role, [&](kt_uint32_t slot, kt_char_ptr_t p_record) -> kt_int32_t {
        const bool equal = rg_i_compare_values_within(&key_value, rg_i_row_slot(p_record, 0), key_type,
                                                      rg_i_row_indirect_data(p_record, p_table->total_columns),
                                                      rg_i_row_indirect_length(p_table, p_record)) == 0;
        return equal ? p_list->append(slot) : 0;
    });
}

} // namespace

kt_int32_t rg_i_get_selected_rows(rg_i_table_t * p_table, kt_char_ptr_t p_selection_criteria,
                                  kt_uint32_t uncommitted_updates_visible, kt_uint32_t * p_total_selected_rows,
                                  kt_uint32_t ** p_p_selected_rows_fixed_index)
{
    if (p_total_selected_rows == nullptr || p_p_selected_rows_fixed_index == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    const row_role    role = rg_i_visible_role(uncommitted_updates_visible | p_table->uncommitted_updates_visible);
    const kt_uint32_t rows_to_visit = rg_i_rows_in_role(p_table, role);
    row_list_t        list;
    if (const kt_int32_t rc = list.grow(rows_to_visit != 0 ? rows_to_visit : 1); rc != 0)
        return rc;
    rg_i_criteria criteria;
    if (const kt_int32_t rc = criteria.compile(p_selection_criteria, p_table); rc != 0)
        return rc;

    // Kept because callers depend on it: which rows are visited follows the visibility, but each is judged by its
    // applied record. A row whose deletion is pending has none, and matches no criteria.
    kt_uint32_t *    p_rows = list.rows.get();
    kt_uint32_t      total  = 0;
    const kt_int32_t rc =
        rg_i_walk_matching_rows(p_table, role, row_role::applied, criteria, [&](kt_uint32_t slot, kt_char_ptr_t) {
            p_rows[total++] = slot;
            return 0;
        });
    if (rc != 0)
        return rc;
    *p_total_selected_rows         = total;
    *p_p_selected_rows_fixed_index = list.rows.release();
    return 0;
}

kt_int32_t rg_i_get_updated_rows(rg_i_table_t * p_table, kt_uint32_t * p_updated_rows_count,
                                 kt_uint32_t ** p_p_updated_rows_fixed_indices)
{
    if (p_updated_rows_count == nullptr || p_p_updated_rows_fixed_indices == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    const kt_uint32_t updated = length_of(p_table->p_rows_change_list);
    const kt_uint32_t deleted = length_of(p_table->p_delete_rows_change_list);
    row_list_t        list;
    if (updated + deleted != 0) {
        if (const kt_int32_t rc = list.grow(updated + deleted); rc != 0)
            return rc;
        append_all(p_table, p_table->p_rows_change_list, &list);
        append_all(p_table, p_table->p_delete_rows_change_list, &list);
    }
    // Kept because callers depend on it: the deleted rows stand in the list behind the count that is reported.
    *p_updated_rows_count           = updated;
    *p_p_updated_rows_fixed_indices = list.rows.release();
    return 0;
}

kt_int32_t rg_i_get_duplicate_rows(rg_i_table_t * p_table, kt_value_t key_value, kt_uint32_t * p_duplicate_rows_count,
                                   kt_uint32_t ** p_p_duplicate_rows_fixed_indices,
                                   kt_uint32_t    uncommitted_updates_visible)
{
    const kt_data_type_t key_type = p_table->p_columns[0].type;
    const bool           indirect = rg_i_type_is_indirect(key_type);
    if (p_duplicate_rows_count == nullptr || p_p_duplicate_rows_fixed_indices == nullptr ||
        (indirect && key_value.ptr_char == nullptr))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    // Kept because callers depend on it: the argument alone counts here, the table's own visibility plays no part.
    const row_role role = rg_i_visible_role(uncommitted_updates_visible);
    row_list_t     list;
    if (const kt_int32_t rc = list.grow(first_capacity); rc != 0)
        return rc;
    kt_char_ptr_t    p_key = indirect ? key_value.ptr_char : reinterpret_cast<kt_char_ptr_t>(&key_value);
    const kt_int32_t rc    = p_table->p_rows_hash_table != nullptr ? list_bucket(p_table, p_key, role, &list)
                                                                   : list_by_scan(p_table, key_value, role, &list);
    if (rc != 0)
        return rc;
    if (list.total == 0) {
        trace_key_not_found(RG_HERE, p_table->p_name, key_value, key_type);
        return RG_E_NO_SUCH_KEY;
    }
    *p_duplicate_rows_count           = list.total;
    *p_p_duplicate_rows_fixed_indices = list.rows.release();
    return 0;
}
