// SPDX-License-Identifier: MIT
// rg_i_select: makes a new table of the rows of another that match criteria, with all its columns or some.
//
// Layer: rows. Stands on the criteria, the row builder, the record pool, and the making and closing of table objects.
// Always holds: the source isn't changed and nothing is shared with it but the tree. The result's rows stand from fixed
// index 0 on in the order of the source's slots; each has one record, which is both its applied and its committed one.
// Locking: the caller holds the source's lock for reading, and the tree's for writing; the result is seen by nobody
// yet.
// Failure: nothing is left of the result.
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"
#include "rows/rg_i_criteria.h"
#include "rows/rg_i_row_builder.h"
#include "rows/rg_i_row_lists.h"
#include "rows/rg_i_row_walk.h"

namespace
{

constexpr char module_version[] = "rg_i_select 1.0";

// A metadata record begins with four words: byte order, a reserved one, total_columns, total_variable_length_columns.
constexpr size_t metadata_head_length           = 16;
constexpr size_t total_columns_offset           = 8;
constexpr size_t variable_length_columns_offset = 12;

// Mode of a result: open for writing, and of a kind that its own implicitly_controlled, which stays 1, doesn't follow.
constexpr kt_uint32_t result_mode = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// The positions in the source of the result's columns: the key, and then the caller's others in the caller's order.
[[nodiscard]] kt_int32_t choose_columns(const rg_i_table_t * p_table, kt_char_ptr_t * p_column_names,
                                        kt_uint32_t total_column_names, owned_ptr<kt_uint32_t> * p_column_indices,
                                        kt_uint32_t * p_total_select_columns)
{
    if (p_column_names == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_COLUMNS);
    owned_ptr<kt_uint32_t> indices(
        static_cast<kt_uint32_t *>(std::malloc((size_t{total_column_names} + 1) * sizeof(kt_uint32_t))));
    if (!indices)
        return rg_i_fail_no_memory(RG_HERE);

    indices.get()[0]                 = 0;
    kt_uint32_t total_select_columns = 1;
    for (kt_uint32_t i = 0; i < total_column_names; ++i) {
        if (p_column_names[i] == nullptr)
            return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
        const kt_uint32_t column = rg_i_find_column(p_table, p_column_names[i]);
        if (column == p_table->total_columns)
            return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
        if (column != 0)
            indices.get()[total_select_columns++] = column;
    }
    *p_column_indices       = std::move(indices);
    *p_total_select_columns = total_select_columns;
    return 0;
}

// Makes the result's first block large enough for the whole copy. Nothing is taken.
[[nodiscard]] kt_int32_t make_room_for_copy(const rg_i_table_t * p_table, rg_i_table_t * p_new_table)
{
    kt_char_ptr_t p_room                 = nullptr;
    kt_char_ptr_t p_previous_free_record = nullptr;
    kt_uint32_t   length                 = 0;
    return rg_i_rb_lend_record(&p_new_table->record_buffer_pool, p_table->record_buffer_pool.used_bytes, &p_room,
                               &p_previous_free_record, &length);
}

// Copies the columns, and the names, definitions and default data of all of them: anchors of defaults count from the
// end of the column array and stay valid as they are.
[[nodiscard]] kt_int32_t copy_metadata(const rg_i_table_t * p_table, rg_i_table_t * p_new_table,
                                       const kt_uint32_t * p_column_indices, kt_uint32_t total_select_columns)
{
    const kt_uint64_t from_length  = rg_i_record_data_length(p_table->p_metadata_record_data);
    const kt_uint64_t from_columns = kt_uint64_t{p_table->total_columns} * sizeof(rg_column_t);
    const kt_uint64_t to_columns   = kt_uint64_t{total_select_columns} * sizeof(rg_column_t);
    const kt_uint64_t behind       = from_length - metadata_head_length - from_columns;
    const kt_uint64_t to_length    = metadata_head_length + to_columns + behind;
    if (to_length > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE);
    kt_char_ptr_t p_to = nullptr;
    if (const kt_int32_t rc = rg_i_reserve_record(&p_new_table->record_buffer_pool, static_cast<kt_uint32_t>(to_length),
                                                  RG_RECORD_TYPE_METADATA, &p_to);
        rc != 0)
        return rc;

    // Nothing below fails.
    auto *            p_columns      = reinterpret_cast<rg_column_t *>(p_to + metadata_head_length);
    const kt_char_t * p_from_data    = rg_i_default_data(p_table);
    const kt_char_t * p_from_names   = rg_i_names_record_data(p_table) + metadata_head_length + from_columns;
    kt_char_ptr_t     p_to_data      = p_to + metadata_head_length + to_columns;
    kt_uint32_t       total_indirect = 0;
    std::memcpy(p_to_data, p_from_data, behind);
    for (kt_uint32_t i = 0; i < total_select_columns; ++i) {
        rg_column_t definition = p_table->p_columns[p_column_indices != nullptr ? p_column_indices[i] : i];
        definition.name        = p_to_data + (definition.name - p_from_names);
        if (definition.sd_defn != nullptr)
            definition.sd_defn = reinterpret_cast<rg_sd_def_t *>(
                p_to_data + (reinterpret_cast<const kt_char_t *>(definition.sd_defn) - p_from_names));
        if (rg_i_type_is_indirect(definition.type))
            ++total_indirect;
        std::memcpy(static_cast<void *>(&p_columns[i]), &definition, sizeof definition);
    }
    std::memcpy(p_to, p_table->p_metadata_record_data, total_columns_offset);
    rg_i_store_u32(p_to + total_columns_offset, total_select_columns);
    rg_i_store_u32(p_to + variable_length_columns_offset, total_indirect);

    p_new_table->p_metadata_record_data        = p_to;
    p_new_table->p_columns                     = p_columns;
    p_new_table->total_columns                 = total_select_columns;
    p_new_table->total_variable_length_columns = total_indirect;
    return 0;
}

[[nodiscard]] kt_int32_t make_row_access(const rg_i_table_t * p_table, rg_i_table_t * p_new_table)
{
    if (const kt_int32_t rc = rg_i_establish_rows_index(p_new_table, p_table->total_applied_rows); rc != 0)
        return rc;
    if (const rg_hash_table_t * p_hash_table = p_table->p_rows_hash_table; p_hash_table != nullptr)
        if (const kt_int32_t rc =
                rg_i_hash_table_open(p_hash_table->total_hash_buckets, p_hash_table->p_hash_function,
                                     p_hash_table->p_compare_function, &p_new_table->p_rows_hash_table);
            rc != 0)
            return rc;
    return rg_i_allocate_application_metadata_buffer(1, &p_new_table->p_application_metadata);
}

[[nodiscard]] kt_int32_t copy_matching_rows(rg_i_table_t * p_table, kt_char_ptr_t p_selection_criteria,
                                            rg_i_table_t * p_new_table, kt_uint32_t * p_column_indices)
{
    rg_i_criteria criteria;
    if (const kt_int32_t rc = criteria.compile(p_selection_criteria, p_table); rc != 0)
        return rc;
    // Kept because callers depend on it: there is no argument of visibility, the source's own field alone counts.
    const row_role role = rg_i_visible_role(p_table->uncommitted_updates_visible);
    return rg_i_walk_matching_rows(p_table, role, role, criteria, [&](kt_uint32_t, kt_char_ptr_t p_record) {
        return rg_i_copy_row(p_table, p_record, p_new_table, p_column_indices);
    });
}

[[nodiscard]] kt_int32_t fill_table(rg_i_table_t * p_table, kt_uint32_t * p_column_indices,
                                    kt_uint32_t total_select_columns, kt_char_ptr_t p_selection_criteria,
                                    rg_i_table_t * p_new_table)
{
    if (const kt_int32_t rc = make_room_for_copy(p_table, p_new_table); rc != 0)
        return rc;
    if (const kt_int32_t rc = copy_metadata(p_table, p_new_table, p_column_indices, total_select_columns); rc != 0)
        return rc;
    if (const kt_int32_t rc = make_row_access(p_table, p_new_table); rc != 0)
        return rc;
    if (const kt_int32_t rc = copy_matching_rows(p_table, p_selection_criteria, p_new_table, p_column_indices); rc != 0)
        return rc;
    p_new_table->total_committed_rows = p_new_table->total_applied_rows;
    return rg_i_establish_secondary_row_access(p_new_table);
}

// The record in the result's pool, whole.
[[nodiscard]] kt_int32_t copy_whole_record(kt_char_ptr_t p_from_record, rg_i_table_t * p_new_table,
                                           kt_char_ptr_t * p_to_record)
{
    rg_i_record_buffer_pool_t * p_pool                 = &p_new_table->record_buffer_pool;
    const kt_uint32_t           length                 = rg_i_record_data_length(p_from_record);
    kt_char_ptr_t               p_previous_free_record = nullptr;
    kt_uint32_t                 capacity               = 0;
    if (const kt_int32_t rc = rg_i_rb_lend_record(p_pool, length, p_to_record, &p_previous_free_record, &capacity);
        rc != 0)
        return rc;
    std::memcpy(*p_to_record, p_from_record, length);
    const kt_int32_t rc = rg_i_rb_take_record(p_pool, *p_to_record, p_previous_free_record, length, RG_RECORD_TYPE_ROW);
    if (rc != 0)
        rg_i_rb_give_back_record(p_pool, *p_to_record, length);
    return rc;
}

// A record of the chosen columns, whose indirect data comes out packed. Room is tested for each: a column that stands
// twice can make the record longer than its source.
[[nodiscard]] kt_int32_t copy_chosen_columns(const rg_i_table_t * p_table, kt_char_ptr_t p_from_record,
                                             rg_i_table_t * p_new_table, const kt_uint32_t * p_column_indices,
                                             kt_char_ptr_t * p_to_record)
{
    const kt_uint32_t  fixed_length = rg_i_row_fixed_length(p_new_table->total_columns);
    const kt_uint32_t  from_length  = rg_i_record_data_length(p_from_record);
    rg_i_row_builder_t row;
    if (const kt_int32_t rc =
            rg_i_row_builder_open(&row, p_new_table, from_length > fixed_length ? from_length : fixed_length);
        rc != 0)
        return rc;
    kt_int32_t rc = 0;
    for (kt_uint32_t i = 0; rc == 0 && i < p_new_table->total_columns; ++i)
        rc = rg_i_row_builder_carry_value(&row, i, rg_i_row_slot(p_from_record, p_column_indices[i]),
                                          rg_i_row_indirect_data(p_from_record, p_table->total_columns),
                                          rg_i_row_indirect_length(p_table, p_from_record), room_grows::by_the_length);
    if (rc == 0)
        rc = rg_i_row_builder_take(&row, 0);
    if (rc != 0)
        rg_i_row_builder_abandon(&row);
    *p_to_record = row.p_record;
    return rc;
}

} // namespace

kt_int32_t rg_i_copy_row(rg_i_table_t * p_table, kt_char_ptr_t p_from_record_data, rg_i_table_t * p_new_table,
                         kt_uint32_t * p_column_indices)
{
    rg_i_index_entry_t * p_index_entry = rg_i_rows_free_chain_remove(p_new_table);
    if (p_index_entry == nullptr)
        return rg_i_fail_internal(RG_HERE); // the index was made for all rows of the source
    kt_char_ptr_t    p_record = nullptr;
    const kt_int32_t rc = p_column_indices == nullptr ? copy_whole_record(p_from_record_data, p_new_table, &p_record)
                                                      : copy_chosen_columns(p_table, p_from_record_data, p_new_table,
                                                                            p_column_indices, &p_record);
    if (rc != 0) {
        rg_i_rows_free_chain_insert(p_new_table, p_index_entry);
        return rc;
    }

    // Nothing below fails.
    p_index_entry->p_applied           = p_record;
    p_index_entry->p_committed         = p_record;
    p_index_entry->file_offset         = 0;
    p_index_entry->applied_file_offset = 0;
    p_index_entry->p_pending_change    = nullptr;
    ++p_new_table->total_applied_rows;
    return 0;
}

kt_int32_t rg_i_select(rg_i_table_t * p_table, kt_char_ptr_t * p_column_names, kt_uint32_t total_column_names,
                       kt_char_ptr_t p_selection_criteria, rg_i_table_t ** p_select_table)
{
    owned_ptr<kt_uint32_t> column_indices;
    kt_uint32_t            total_select_columns = p_table->total_columns;
    if (total_column_names != 0)
        if (const kt_int32_t rc =
                choose_columns(p_table, p_column_names, total_column_names, &column_indices, &total_select_columns);
            rc != 0)
            return rc;

    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = rg_i_create_null_table(&p_new_table); rc != 0)
        return rc;
    p_new_table->mode = result_mode;
    if (const kt_int32_t rc =
            fill_table(p_table, column_indices.get(), total_select_columns, p_selection_criteria, p_new_table);
        rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }

    // Nothing below fails.
    p_new_table->p_tree         = p_table->p_tree;
    p_new_table->change_counter = p_table->change_counter + 1;
    *p_select_table             = p_new_table;
    return 0;
}
