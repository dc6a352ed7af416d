// SPDX-License-Identifier: MIT
// rg_i_application_metadata: the application's own data in a table: a small sorted set of typed binaries, each with an
// applied and a committed version.
//
// The set is written whole into every commit record and stands nowhere else. A version is one allocation in the layout
// of a kt_binary_t. An element without a pending change has both pointers at one version: every release tests for that.
// No lock: the table's lock covers every use.
#pragma once

#include <cstdarg>

#include "kt_rg.h"

struct rg_i_application_metadata_index_element_t {
    kt_uint32_t   type;        // the element's id, unique in the index
    kt_char_ptr_t p_applied;   // NULL: deleted by a pending update
    kt_char_ptr_t p_committed; // NULL: new, not committed yet
};

struct rg_i_application_metadata_t {
    kt_uint32_t                                 max_elements;   // capacity of the index
    kt_uint32_t                                 total_elements; // elements in use
    rg_i_application_metadata_index_element_t * p_index;        // ascending by type
};

static_assert(offsetof(rg_i_application_metadata_t, p_index) == 8);
static_assert(offsetof(rg_i_application_metadata_index_element_t, p_committed) == 16);

[[nodiscard]] kt_int32_t
                         rg_i_allocate_application_metadata_buffer(kt_uint32_t                    max_elements,
                                                                   rg_i_application_metadata_t ** p_application_metadata);
kt_int32_t               rg_i_free_application_metadata(rg_i_application_metadata_t * p_application_metadata);
[[nodiscard]] kt_int32_t rg_i_add_application_metadata_element(rg_i_application_metadata_t * p_application_metadata,
                                                               kt_uint32_t type, kt_uint32_t length,
                                                               kt_char_ptr_t p_data);
[[nodiscard]] kt_int32_t rg_i_set_application_metadata_element(rg_i_application_metadata_t * p_application_metadata,
                                                               kt_uint32_t type, kt_uint32_t length,
                                                               kt_char_ptr_t p_data);
[[nodiscard]] kt_int32_t rg_i_delete_application_metadata_element(rg_i_application_metadata_t * p_application_metadata,
                                                                  kt_uint32_t                   type);
[[nodiscard]] kt_int32_t rg_i_get_application_metadata_element(rg_i_application_metadata_t * p_application_metadata,
                                                               kt_uint32_t                   type,
                                                               kt_uint32_t   uncommitted_updates_visible,
                                                               kt_uint32_t * p_length, kt_char_ptr_t * p_data);
[[nodiscard]] kt_int32_t
rg_i_get_application_metadata_element_binary(rg_i_application_metadata_t * p_application_metadata, kt_uint32_t type,
                                             kt_uint32_t uncommitted_updates_visible, kt_binary_ptr_t * p_p_binary);
kt_int32_t rg_i_commit_application_metadata_buffer_updates(rg_i_application_metadata_t * p_application_metadata);
kt_int32_t rg_i_abort_application_metadata_buffer_updates(rg_i_application_metadata_t * p_application_metadata);
[[nodiscard]] kt_int32_t rg_i_set_application_metadata(rg_i_application_metadata_t * p_application_metadata,
                                                       kt_uint32_t type, kt_uint32_t length, kt_char_ptr_t p_data);
[[nodiscard]] kt_int32_t rg_i_set_application_metadata_v(rg_i_application_metadata_t * p_application_metadata,
                                                         kt_uint32_t array_count, va_list ap);
[[nodiscard]] kt_int32_t rg_i_get_application_metadata(rg_i_application_metadata_t * p_application_metadata,
                                                       kt_uint32_t uncommitted_updates_visible, kt_uint32_t type,
                                                       kt_uint32_t * p_length, kt_char_ptr_t * p_data);
[[nodiscard]] kt_int32_t
rg_i_duplicate_application_metadata_buffer(rg_i_application_metadata_t *  p_application_metadata,
                                           rg_i_application_metadata_t ** p_p_to_application_metadata);
