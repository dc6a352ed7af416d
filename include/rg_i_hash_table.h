// SPDX-License-Identifier: MIT
// rg_i_hash_table: the chained table from key to fixed row index.
//
// It doesn't own keys: an element points into the row record that holds the key, and whoever moves the record points
// the element at the new place. No lock: the table's lock covers every use.
#pragma once

#include "kt_rg.h"

struct rg_hash_table_element_t {
    kt_uint32_t               row_index;   // fixed index of the row
    kt_char_ptr_t             p_key_value; // the key, inside a row record
    rg_hash_table_element_t * p_next;      // next element of the bucket
};

struct rg_hash_table_t {
    kt_uint32_t                       total_hash_buckets; // fixed for life
    rg_hash_function_t *              p_hash_function;    // NULL: the built-in rule for resource handles
    rg_hash_keys_compare_function_t * p_compare_function;
    rg_hash_table_element_t **        p_elements; // the bucket heads
    rg_hash_table_element_t *         p_places;   // one a bucket: where the element of an empty bucket is put
};

static_assert(offsetof(rg_hash_table_element_t, p_key_value) == 8 && offsetof(rg_hash_table_element_t, p_next) == 16);
static_assert(offsetof(rg_hash_table_t, p_hash_function) == 8 && offsetof(rg_hash_table_t, p_elements) == 24);

[[nodiscard]] kt_int32_t rg_i_hash_table_open(kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                              rg_hash_keys_compare_function_t * p_compare_function,
                                              rg_hash_table_t **                p_hash_table);
kt_int32_t               rg_i_hash_table_close(rg_hash_table_t * p_hash_table);

// Bucket of a key, or total_hash_buckets or more if the caller's function returned such a number.
[[nodiscard]] kt_uint32_t rg_i_hash_table_bucket(const rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value);

[[nodiscard]] kt_int32_t rg_i_hash_table_add(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value,
                                             kt_uint32_t row_index, kt_uint32_t * p_hash_index,
                                             rg_hash_table_element_t ** p_p_hash_table_element,
                                             rg_qualifier_t             qualifier);
// The two steps of adding, for a caller with many keys: it has the buckets fetched ahead. The bucket is the key's, which
// is as the caller's function returned it and may be out of range.
void                     rg_i_hash_table_fetch_bucket(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket);
[[nodiscard]] kt_int32_t rg_i_hash_table_add_to_bucket(rg_hash_table_t * p_hash_table, kt_uint32_t bucket,
                                                       kt_char_ptr_t p_key_value, kt_uint32_t row_index,
                                                       rg_hash_table_element_t ** p_p_hash_table_element,
                                                       rg_qualifier_t             qualifier);
[[nodiscard]] kt_int32_t rg_i_hash_table_get_index(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value,
                                                   kt_uint32_t * row_index, kt_char_ptr_t ** p_p_p_key_value);
// The same for a caller who goes on to what the row index leads to: entry row_index of an array with entries of so many
// bytes. It is fetched while the key, which takes as long to arrive, is compared.
[[nodiscard]] kt_int32_t rg_i_hash_table_get_index_and_fetch(const rg_hash_table_t * p_hash_table,
                                                             kt_char_ptr_t p_key_value, kt_uint32_t * row_index,
                                                             const void * p_entries, size_t entry_length);
[[nodiscard]] kt_int32_t rg_i_hash_table_remove(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value);
[[nodiscard]] kt_int32_t rg_i_hash_table_remove_element(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index,
                                                        rg_hash_table_element_t * p_hash_table_element);
// Puts an element with its own copy of the key in the element's place in the bucket, for a key whose row record goes
// away ahead of its row. The former element is gone; its neighbours and their order stay.
[[nodiscard]] kt_int32_t rg_i_hash_table_own_key(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index,
                                                 kt_uint32_t                key_length,
                                                 rg_hash_table_element_t ** p_p_hash_table_element);
void                     rg_i_hash_table_output_stats(rg_hash_table_t * p_hash_table);
