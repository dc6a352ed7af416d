// SPDX-License-Identifier: MIT
// exported_calls: all functions of the interface that work on one tree or table, with their trace ids.
#pragma once

#include <cstdarg>
#include <functional>
#include <vector>

#include "support/registry.h"

namespace kt_test
{

struct exported_call {
    const char *                                  name;
    kt_uint32_t                                   entry_id;
    bool                                          is_update; // refused in a forked child
    std::function<kt_int32_t(rg_opaque_handle_t)> call;
};

// The call that takes a list of arguments, which only a variadic function has.
inline kt_int32_t get_selected_rows(rg_opaque_handle_t table, kt_char_ptr_t p_criteria, ...)
{
    kt_uint32_t   total  = 0;
    kt_uint32_t * p_rows = nullptr;
    va_list       ap;
    va_start(ap, p_criteria);
    const kt_int32_t rc = rg_get_selected_rows_v_1(table, p_criteria, ap, 0, &total, &p_rows);
    va_end(ap);
    return rc;
}

// Each exported call on one tree or table, given the handle and otherwise good arguments.
inline const std::vector<exported_call> & all_calls()
{
    static kt_char_ptr_t         name       = text("K");
    static kt_char_ptr_t         other_name = text("V");
    static kt_char_ptr_t         path       = text("/t");
    static kt_char_ptr_t         dir        = text("/tmp");
    static kt_value_t            value      = uint32(1);
    static kt_value_t *          values     = &value;
    static rg_column_t           key        = column("K", KT_UINT32, RG_PRIMARY_KEY);
    static rg_row_state_t        state;
    static kt_uint32_t           index;
    static kt_uint32_t *         p_rows;
    static kt_binary_t           binary{1, {0}};
    static kt_binary_t *         p_binary;
    static kt_char_ptr_t *       p_list;
    static rg_table_metadata_t * p_metadata;
    using handle_t = rg_opaque_handle_t;
    static handle_t result;

    static const std::vector<exported_call> calls = {
        {"rg_abort_1", 1, true, [](handle_t h) { return rg_abort_1(h); }},
        {"rg_add_columns_1", 3, true, [](handle_t h) { return rg_add_columns_1(h, nullptr, 0); }},
        {"rg_add_row_1", 5, true, [](handle_t h) { return rg_add_row_1(h, &name, &values, 1); }},
        {"rg_apply_1", 7, true, [](handle_t h) { return rg_apply_1(h, 0); }},
        {"rg_change_column_name_1", 9, true, [](handle_t h) { return rg_change_column_name_1(h, name, name); }},
        {"rg_change_default_value_1", 11, true, [](handle_t h) { return rg_change_default_value_1(h, name, value); }},
        {"rg_close_table_1", 13, false, [](handle_t h) { return rg_close_table_1(h); }},
        {"rg_close_tree_1", 15, false, [](handle_t h) { return rg_close_tree_1(h); }},
        {"rg_commit_1", 17, true, [](handle_t h) { return rg_commit_1(h); }},
        {"rg_copy_table_by_handle_1", 19, true, [](handle_t h) { return rg_copy_table_by_handle_1(h, path, 0); }},
        {"rg_copy_table_by_name_1", 21, true, [](handle_t h) { return rg_copy_table_by_name_1(h, path, path, 0); }},
        {"rg_create_table_1", 23, true, [](handle_t h) { return rg_create_table_1(h, path, &key, 1, 2, &result); }},
        {"rg_create_hashed_key_table_1", 25, true,
         [](handle_t h) {
             return rg_create_hashed_key_table_1(h, path, &key, 1, 2, 8, hash_uint32, compare_uint32, &result);
         }},
        {"rg_delete_columns_1", 27, true, [](handle_t h) { return rg_delete_columns_1(h, &other_name, 1); }},
        {"rg_delete_row_by_index_1", 29, true, [](handle_t h) { return rg_delete_row_by_index_1(h, 0); }},
        {"rg_delete_rows_1", 31, true, [](handle_t h) { return rg_delete_rows_1(h, nullptr); }},
        {"rg_delete_table_1", 33, true, [](handle_t h) { return rg_delete_table_1(h, path); }},
        {"rg_get_application_metadata_1", 39, false,
         [](handle_t h) { return rg_get_application_metadata_1(h, &p_binary); }},
        {"rg_get_duplicate_rows_1", 41, false,
         [](handle_t h) { return rg_get_duplicate_rows_1(h, value, &index, &p_rows, 0); }},
        {"rg_get_field_by_fixed_index_and_visibility_1", 43, false,
         [](handle_t h) { return rg_get_field_by_fixed_index_and_visibility_1(h, 0, name, &value, 0, &state); }},
        {"rg_get_field_by_index_1", 45, false, [](handle_t h) { return rg_get_field_by_index_1(h, 0, name, &value); }},
        {"rg_get_field_by_index_and_visibility_1", 47, false,
         [](handle_t h) { return rg_get_field_by_index_and_visibility_1(h, 0, name, &value, 0, &state); }},
        {"rg_get_field_by_key_1", 49, false, [](handle_t h) { return rg_get_field_by_key_1(h, value, name, &value); }},
        {"rg_get_field_by_key_and_visibility_1", 51, false,
         [](handle_t h) { return rg_get_field_by_key_and_visibility_1(h, value, name, &value, 0, &state); }},
        {"rg_get_fields_by_fixed_index_and_visibility_1", 53, false,
         [](handle_t h) { return rg_get_fields_by_fixed_index_and_visibility_1(h, 0, &name, &values, 1, 0, &state); }},
        {"rg_get_fields_by_index_1", 55, false,
         [](handle_t h) { return rg_get_fields_by_index_1(h, 0, &name, &values, 1); }},
        {"rg_get_fields_by_index_and_visibility_1", 57, false,
         [](handle_t h) { return rg_get_fields_by_index_and_visibility_1(h, 0, &name, &values, 1, 0, &state); }},
        {"rg_get_fields_by_key_1", 59, false,
         [](handle_t h) { return rg_get_fields_by_key_1(h, value, &name, &values, 1); }},
        {"rg_get_fields_by_key_and_visibility_1", 61, false,
         [](handle_t h) { return rg_get_fields_by_key_and_visibility_1(h, value, &name, &values, 1, 0, &state); }},
        {"rg_get_selected_rows_v_1", 63, false, [](handle_t h) { return get_selected_rows(h, nullptr); }},
        {"rg_get_updated_rows_1", 67, false, [](handle_t h) { return rg_get_updated_rows_1(h, &index, &p_rows); }},
        {"rg_list_tables_1", 69, false, [](handle_t h) { return rg_list_tables_1(h, path, &p_list, &index); }},
        {"rg_mount_local_tree_1", 71, true, [](handle_t h) { return rg_mount_local_tree_1(h, path, dir, 1); }},
        {"rg_move_table_by_handle_1", 73, true, [](handle_t h) { return rg_move_table_by_handle_1(h, path, 0); }},
        {"rg_move_table_by_name_1", 75, true, [](handle_t h) { return rg_move_table_by_name_1(h, path, path, 0); }},
        {"rg_open_table_1", 77, false, [](handle_t h) { return rg_open_table_1(h, path, 2, &result); }},
        {"rg_open_hashed_key_table_1", 79, false,
         [](handle_t h) { return rg_open_hashed_key_table_1(h, path, 2, 8, hash_uint32, compare_uint32, &result); }},
        {"rg_open_tree_1", 81, false, [](handle_t h) { return rg_open_tree_1(static_cast<handle_t *>(h), 0, 0); }},
        {"rg_overlay_memory_column_qualifier_1", 83, true,
         [](handle_t h) { return rg_overlay_memory_column_qualifier_1(h, other_name, RG_STANDARD); }},
        {"rg_overlay_memory_default_value_1", 85, true,
         [](handle_t h) { return rg_overlay_memory_default_value_1(h, name, value); }},
        {"rg_repair_tables_1", 87, false, [](handle_t h) { return rg_repair_tables_1(h, &path, 1); }},
        {"rg_select_1", 89, false, [](handle_t h) { return rg_select_1(h, nullptr, 0, &result, nullptr); }},
        {"rg_set_application_metadata_1", 91, true,
         [](handle_t h) { return rg_set_application_metadata_1(h, &binary); }},
        {"rg_set_field_by_fixed_index_1", 93, true,
         [](handle_t h) { return rg_set_field_by_fixed_index_1(h, 0, name, &value); }},
        {"rg_set_field_by_index_1", 95, true, [](handle_t h) { return rg_set_field_by_index_1(h, 0, name, &value); }},
        {"rg_set_field_by_key_1", 97, true, [](handle_t h) { return rg_set_field_by_key_1(h, value, name, &value); }},
        {"rg_set_fields_by_fixed_index_1", 99, true,
         [](handle_t h) { return rg_set_fields_by_fixed_index_1(h, 0, &name, &values, 1); }},
        {"rg_set_fields_by_index_1", 101, true,
         [](handle_t h) { return rg_set_fields_by_index_1(h, 0, &name, &values, 1); }},
        {"rg_set_fields_by_key_1", 103, true,
         [](handle_t h) { return rg_set_fields_by_key_1(h, value, &name, &values, 1); }},
        {"rg_unmount_local_tree_1", 105, false, [](handle_t h) { return rg_unmount_local_tree_1(h, path); }},
        {"rg_get_table_metadata_1", 65, false, [](handle_t h) { return rg_get_table_metadata_1(h, 0, &p_metadata); }},
        {"rg_get_fixed_row_index_for_key_1", 107, false,
         [](handle_t h) { return rg_get_fixed_row_index_for_key_1(h, value, &index); }},
    };
    return calls;
}

} // namespace kt_test
