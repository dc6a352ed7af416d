/* SPDX-License-Identifier: MIT
 *
 * kt_rg.h: the registry: a small, embedded, transactional store of typed tables.
 *
 * Valid C11 and C++. Every function returns 0 or one of the RG_E_ codes; ku_get_error_record_1 (kt_ku.h) then holds the
 * message. Any thread may call any function, but a handle may not be closed while another thread uses it, and a caller
 * must not have a thread cancelled inside a call. What each call does on bad input is told in docs/BAD-INPUT.md.
 */
#ifndef KT_RG_H
#define KT_RG_H

#include "kt_types.h"

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

/* ---- Result codes ---------------------------------------------------------------------------------------------- */

enum {
    /* Faults of the environment or of the library. */
    RG_E_SYSTEM_CALL            = 10,
    RG_E_LIBRARY_CALL           = 11,
    RG_E_NO_MEMORY              = 12,
    RG_E_FILESYSTEM_FULL        = 13,
    RG_E_TABLE_UNREADABLE       = 14,
    RG_E_INTERNAL               = 15,
    RG_E_FILESYSTEM_FULL_DETAIL = 16,
    /* Mistakes in the call. */
    RG_E_INVALID_HANDLE        = 100,
    RG_E_NULL_POINTER          = 101,
    RG_E_INVALID_PATH          = 102,
    RG_E_INVALID_MODE          = 103,
    RG_E_NO_COLUMNS            = 104,
    RG_E_INVALID_COLUMN        = 105,
    RG_E_DUPLICATE_COLUMN      = 106,
    RG_E_KEY_EXPECTED          = 107,
    RG_E_DUPLICATE_KEY         = 108,
    RG_E_INVALID_VARIABLE_TYPE = 109,
    /* States of the registry. */
    RG_E_NO_SUCH_TABLE          = 200,
    RG_E_TABLE_EXISTS           = 201,
    RG_E_NO_SUCH_KEY            = 202,
    RG_E_NO_SUCH_INDEX          = 203,
    RG_E_ROW_DELETED            = 204,
    RG_E_NO_ROWS_TO_DELETE      = 205,
    RG_E_ACCESS                 = 206,
    RG_E_MOUNT_POINT_EXISTS     = 207,
    RG_E_NO_SUCH_MOUNT_POINT    = 208,
    RG_E_UNCOMMITTED_TABLE      = 209,
    RG_E_UNAPPLIED_TABLE        = 210,
    RG_E_EXCLUSIVE_OPEN         = 211,
    RG_E_APPLIED_UNCOMMITTED    = 212,
    RG_E_BAD_REPLACES_OFFSET    = 213,
    RG_E_BAD_DELETED_ROW_OFFSET = 214,
    RG_E_NO_COMMIT_RECORD       = 215
};

/* The default texts of the messages, by message index; index 0 is a filler. */
enum { RG_TOTAL_MESSAGES = 32 };
extern kt_char_ptr_t ku_mesgtbl_kt_rg_set[RG_TOTAL_MESSAGES];

/* ---- Shared types ---------------------------------------------------------------------------------------------- */

/* The address of a tree or of a table. NULL is refused with RG_E_INVALID_HANDLE; any other wrong value is not noticed.
 */
typedef void * rg_opaque_handle_t;

/* How a table is opened or created: READ and WRITE say what for, EXPLICIT_CONTROL that the caller itself applies and
 * commits; without it each update is applied and committed before its call returns. */
enum { RG_MODE_READ = 1, RG_MODE_WRITE = 2, RG_MODE_EXPLICIT_CONTROL = 4 };

/* What a column is: a kind in the low four bits, and modifier bits. Stands in files and on the wire: never renumber. */
typedef kt_uint32_t rg_qualifier_t;
enum {
    RG_UNKNOWN_QUALIFIER   = 0,
    RG_SYSTEM              = 1,
    RG_STANDARD            = 2,
    RG_PRIMARY_KEY         = 3,
    RG_PRIMARY_KEY_NOCHECK = 4,

    RG_PROTECTED                       = 16,
    RG_INVISIBLE                       = 32,
    RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED = 64
};

/* What stands of a row: see docs/ARCHITECTURE.md. */
typedef kt_uint32_t rg_row_state_t;
enum {
    RG_ROW_STATE_COMMITTED = 0,
    RG_ROW_STATE_ADDED     = 1,
    RG_ROW_STATE_UPDATED   = 2,
    RG_ROW_STATE_DELETED   = 3,
    RG_ROW_STATE_NO_ROW    = 4
};

/* The fields of a structured data column. */
typedef struct rg_field_def_t {
    kt_data_type_t type;
    kt_char_ptr_t  name;
} rg_field_def_t;

typedef struct rg_sd_def_t {
    kt_uint32_t    number_of_fields;
    rg_field_def_t fields[1];
} rg_sd_def_t;

/* One column. */
typedef struct rg_column_t {
    kt_char_ptr_t  name; /* 1 to 255 bytes: a letter, then letters, digits and '_' */
    kt_data_type_t type; /* KT_INT32 to KT_SD_PTR_ARRAY */
    rg_qualifier_t qualifier;
    kt_int32_t     properties;    /* carried and not interpreted */
    rg_sd_def_t *  sd_defn;       /* for KT_SD_PTR and KT_SD_PTR_ARRAY; ignored otherwise */
    kt_value_t     default_value; /* a NULL pointer stands for the type's empty value */
} rg_column_t;

KT_STATIC_ASSERT(sizeof(rg_field_def_t) == 16 && offsetof(rg_field_def_t, name) == 8, "rg_field_def_t");
KT_STATIC_ASSERT(offsetof(rg_sd_def_t, fields) == 8, "rg_sd_def_t");
KT_STATIC_ASSERT(sizeof(rg_column_t) == 40 && offsetof(rg_column_t, sd_defn) == 24 &&
                     offsetof(rg_column_t, default_value) == 32,
                 "rg_column_t");

/* Maps a key to a bucket below the bucket count that the table was given. The key is the address of the value for a
 * scalar key, and the string or the handle itself for the others. */
typedef kt_uint32_t rg_hash_function_t(void * p_key);
/* 0 if the two keys are equal. */
typedef kt_int32_t rg_hash_keys_compare_function_t(void * p_key1, void * p_key2);

/* ---- Trees and mount points ------------------------------------------------------------------------------------ */

kt_int32_t rg_open_tree_1(rg_opaque_handle_t * tree_handle, kt_uint32_t number_of_retries, kt_uint64_t timeout);
kt_int32_t rg_close_tree_1(rg_opaque_handle_t tree_handle);
kt_int32_t rg_mount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                 kt_char_ptr_t p_filesystem_path, kt_int32_t create);
kt_int32_t rg_unmount_local_tree_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path);

/* ---- Creating, opening and closing tables ---------------------------------------------------------------------- */

kt_int32_t rg_create_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, rg_column_t * p_columns,
                             kt_uint32_t array_count, kt_int32_t mode, rg_opaque_handle_t * p_result_table_handle);
kt_int32_t rg_create_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path,
                                        rg_column_t * p_columns, kt_uint32_t array_count, kt_int32_t mode,
                                        kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                        rg_hash_keys_compare_function_t * p_compare_function,
                                        rg_opaque_handle_t *              p_result_table_handle);
kt_int32_t rg_open_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                           rg_opaque_handle_t * p_result_table_handle);
kt_int32_t rg_open_hashed_key_table_1(rg_opaque_handle_t tree_handle, kt_char_ptr_t p_registry_path, kt_int32_t mode,
                                      kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                      rg_hash_keys_compare_function_t * p_compare_function,
                                      rg_opaque_handle_t *              p_result_table_handle);
kt_int32_t rg_close_table_1(rg_opaque_handle_t table_handle);

/* ---- Transactions ---------------------------------------------------------------------------------------------- */

kt_int32_t rg_apply_1(rg_opaque_handle_t table_handle, kt_uint64_t table_change_counter);
kt_int32_t rg_commit_1(rg_opaque_handle_t table_handle);
kt_int32_t rg_abort_1(rg_opaque_handle_t table_handle);

/* ---- Adding rows ----------------------------------------------------------------------------------------------- */

kt_int32_t rg_add_row_1(rg_opaque_handle_t table_handle, kt_char_ptr_t * p_column_names, kt_value_t ** p_p_fields,
                        kt_uint32_t total_values);

/* ---- Reading fields -------------------------------------------------------------------------------------------- */

kt_int32_t rg_get_field_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t column_name,
                                   kt_value_t * result);
kt_int32_t rg_get_field_by_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t row_index,
                                                  kt_char_ptr_t column_name, kt_value_t * result,
                                                  kt_uint32_t      uncommitted_updates_visible,
                                                  rg_row_state_t * p_row_state);
kt_int32_t rg_get_field_by_fixed_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                                        kt_char_ptr_t column_name, kt_value_t * result,
                                                        kt_uint32_t      uncommitted_updates_visible,
                                                        rg_row_state_t * p_row_state);
kt_int32_t rg_get_field_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t column_name,
                                 kt_value_t * result);
kt_int32_t rg_get_field_by_key_and_visibility_1(rg_opaque_handle_t table_handle, kt_value_t row_key,
                                                kt_char_ptr_t column_name, kt_value_t * result,
                                                kt_uint32_t uncommitted_updates_visible, rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_index_1(rg_opaque_handle_t table_handle, kt_int32_t row_index, kt_char_ptr_t * column_names,
                                    kt_value_t ** result, kt_uint32_t array_count);
kt_int32_t rg_get_fields_by_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t row_index,
                                                   kt_char_ptr_t * column_names, kt_value_t ** result,
                                                   kt_uint32_t array_count, kt_uint32_t uncommitted_updates_visible,
                                                   rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_fixed_index_and_visibility_1(rg_opaque_handle_t table_handle, kt_int32_t fixed_row_index,
                                                         kt_char_ptr_t * column_names, kt_value_t ** result,
                                                         kt_uint32_t      array_count,
                                                         kt_uint32_t      uncommitted_updates_visible,
                                                         rg_row_state_t * p_row_state);
kt_int32_t rg_get_fields_by_key_1(rg_opaque_handle_t table_handle, kt_value_t row_key, kt_char_ptr_t * column_names,
                                  kt_value_t ** result, kt_uint32_t array_count);
kt_int32_t rg_get_fields_by_key_and_visibility_1(rg_opaque_handle_t table_handle, kt_value_t row_key,
                                                 kt_char_ptr_t * column_names, kt_value_t ** result,
                                                 kt_uint32_t array_count, kt_uint32_t uncommitted_updates_visible,
                                                 rg_row_state_t * p_row_state);
kt_int32_t rg_get_fixed_row_index_for_key_1(rg_opaque_handle_t table_handle, kt_value_t key_value,
                                            kt_uint32_t * p_fixed_row_index);

/* ---- The application's own data -------------------------------------------------------------------------------- */

kt_int32_t rg_set_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t * p_binary);
kt_int32_t rg_get_application_metadata_1(rg_opaque_handle_t table_handle, kt_binary_t ** p_p_binary);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
