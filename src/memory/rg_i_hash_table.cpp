// SPDX-License-Identifier: MIT
// rg_i_hash_table: the chained table from key to fixed row index.
//
// Layer: memory. Calls the caller's two functions, and the comparison of resource handles for the built-in rule.
// Always holds: an element stands in the bucket that its key hashes to; newer elements stand ahead of older ones. The
// number of buckets never changes. Keys belong to the rows.
// Locking: none; changed under the table's write lock, read under its read lock.
// Failure: nothing has changed. A duplicate and a miss set no error record: the caller knows whether they are errors.
#include "rg_i_hash_table.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"
#include "kt_ku.h"

namespace
{

constexpr char module_version[] = "rg_i_hash_table 1.0";

// The built-in rule: the low 14 bits of the last word of a resource handle.
constexpr kt_uint32_t handle_buckets     = 16384;
constexpr std::size_t handle_hash_offset = offsetof(kt_resource_handle_t, id) + offsetof(kt_resource_id_t, id4);
static_assert(handle_hash_offset == 16);

constexpr kt_uint32_t qualifier_kind_mask = 15;

using element_t = rg_hash_table_element_t;

// The link that leads to the first element of the bucket whose key equals this one, or NULL.
element_t ** link_to_equal_key(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket, kt_char_ptr_t p_key_value)
{
    for (element_t ** p_link = &p_hash_table->p_elements[bucket]; *p_link != nullptr; p_link = &(*p_link)->p_next)
        if (p_hash_table->p_compare_function((*p_link)->p_key_value, p_key_value) == 0)
            return p_link;
    return nullptr;
}

void unlink_and_free(element_t ** p_link)
{
    element_t * const p_element = *p_link;
    *p_link                     = p_element->p_next;
    std::free(p_element);
}

} // namespace

kt_int32_t rg_i_hash_table_open(kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                rg_hash_keys_compare_function_t * p_compare_function, rg_hash_table_t ** p_hash_table)
{
    if (p_hash_function == nullptr) {
        total_hash_buckets = handle_buckets;
        p_compare_function = ku_rsrc_hndl_cmp_1;
    }
    // A table without buckets refuses every key; it still owns an array.
    const std::size_t array_length = std::max<std::size_t>(total_hash_buckets, 1);
    auto * const      p_elements   = static_cast<element_t **>(std::calloc(array_length, sizeof(element_t *)));
    if (p_elements == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    auto * const p_table = static_cast<rg_hash_table_t *>(std::malloc(sizeof(rg_hash_table_t)));
    if (p_table == nullptr) {
        std::free(p_elements);
        return rg_i_fail_no_memory(RG_HERE);
    }
    *p_table      = {total_hash_buckets, p_hash_function, p_compare_function, p_elements};
    *p_hash_table = p_table;
    return 0;
}

kt_int32_t rg_i_hash_table_close(rg_hash_table_t * p_hash_table)
{
    if (p_hash_table == nullptr)
        return 0;
    for (kt_uint32_t bucket = 0; bucket < p_hash_table->total_hash_buckets; ++bucket)
        while (p_hash_table->p_elements[bucket] != nullptr)
            unlink_and_free(&p_hash_table->p_elements[bucket]);
    std::free(p_hash_table->p_elements);
    std::free(p_hash_table);
    return 0;
}

kt_uint32_t rg_i_hash_table_bucket(const rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value)
{
    // Kept because callers depend on it: the function's result is the bucket as it is, with no modulo.
    if (p_hash_table->p_hash_function != nullptr)
        return p_hash_table->p_hash_function(p_key_value);
    kt_uint32_t last_word = 0;
    std::memcpy(&last_word, p_key_value + handle_hash_offset, sizeof last_word);
    return last_word & (handle_buckets - 1);
}

kt_int32_t rg_i_hash_table_add(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value, kt_uint32_t row_index,
                               kt_uint32_t * p_hash_index, rg_hash_table_element_t ** p_p_hash_table_element,
                               rg_qualifier_t qualifier)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    auto * const p_element = static_cast<element_t *>(std::malloc(sizeof(element_t)));
    if (p_element == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    if ((qualifier & qualifier_kind_mask) == RG_PRIMARY_KEY) {
        if (element_t ** const p_link = link_to_equal_key(p_hash_table, bucket, p_key_value); p_link != nullptr) {
            std::free(p_element);
            *p_p_hash_table_element = *p_link;
            return RG_E_DUPLICATE_KEY; // no error record: the other row may be about to be deleted
        }
    }

    // Nothing below fails.
    *p_element                       = {row_index, p_key_value, p_hash_table->p_elements[bucket]};
    p_hash_table->p_elements[bucket] = p_element;
    *p_hash_index                    = bucket;
    *p_p_hash_table_element          = p_element;
    return 0;
}

kt_int32_t rg_i_hash_table_get_index(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value, kt_uint32_t * row_index,
                                     kt_char_ptr_t ** p_p_p_key_value)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    element_t ** const p_link = link_to_equal_key(p_hash_table, bucket, p_key_value);
    if (p_link == nullptr)
        return RG_E_NO_SUCH_KEY; // no error record: the caller knows the table's name, and reports
    *row_index       = (*p_link)->row_index;
    *p_p_p_key_value = &(*p_link)->p_key_value;
    return 0;
}

kt_int32_t rg_i_hash_table_remove(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    element_t ** const p_link = link_to_equal_key(p_hash_table, bucket, p_key_value);
    if (p_link == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    unlink_and_free(p_link);
    return 0;
}

kt_int32_t rg_i_hash_table_remove_element(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index,
                                          rg_hash_table_element_t * p_hash_table_element)
{
    if (hash_index >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    for (element_t ** p_link = &p_hash_table->p_elements[hash_index]; *p_link != nullptr; p_link = &(*p_link)->p_next) {
        if (*p_link == p_hash_table_element) {
            unlink_and_free(p_link);
            return 0;
        }
    }
    return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
}

kt_int32_t rg_i_hash_table_own_key(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index, kt_uint32_t key_length,
                                   rg_hash_table_element_t ** p_p_hash_table_element)
{
    element_t ** p_link = &p_hash_table->p_elements[hash_index];
    while (*p_link != nullptr && *p_link != *p_p_hash_table_element)
        p_link = &(*p_link)->p_next;
    element_t * const p_former = *p_link;
    if (p_former == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    auto * const p_element = static_cast<element_t *>(std::malloc(sizeof(element_t) + key_length));
    if (p_element == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    // Nothing below fails.
    auto * const p_key = reinterpret_cast<kt_char_ptr_t>(p_element + 1);
    std::memcpy(p_key, p_former->p_key_value, key_length);
    *p_element              = {p_former->row_index, p_key, p_former->p_next};
    *p_link                 = p_element;
    *p_p_hash_table_element = p_element;
    std::free(p_former);
    return 0;
}

void rg_i_hash_table_output_stats(rg_hash_table_t * p_hash_table)
{
    kt_uint32_t max_bucket_count = 0;
    kt_uint32_t unused_buckets   = 0;
    for (kt_uint32_t bucket = 0; bucket < p_hash_table->total_hash_buckets; ++bucket) {
        kt_uint32_t count = 0;
        for (const element_t * p = p_hash_table->p_elements[bucket]; p != nullptr; p = p->p_next)
            ++count;
        if (count == 0)
            ++unused_buckets;
        else
            std::printf("%u %u\n", bucket, count);
        max_bucket_count = std::max(max_bucket_count, count);
    }
    std::printf("total hash buckets : %u\n", p_hash_table->total_hash_buckets);
    std::printf("max_bucket_count   : %u\n", max_bucket_count);
    std::printf("unused buckets     : %u\n", unused_buckets);
}
