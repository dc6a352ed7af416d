// SPDX-License-Identifier: MIT
// rg_i_hash_table: the chained table from key to fixed row index.
//
// Layer: memory. Calls the caller's two functions, and the comparison of resource handles for the built-in rule.
// Always holds: an element stands in the bucket that its key hashes to; newer elements stand ahead of older ones. The
// number of buckets never changes. Keys belong to the rows. An element that comes to an empty bucket is put in the
// bucket's own place, all others into memory of their own: so a lookup finds most elements without a second walk through
// memory, and a table with room enough allocates nothing for a row.
// Locking: none; changed under the table's write lock, read under its read lock.
// Failure: nothing has changed. A duplicate and a miss set no error record: the caller knows whether they are errors.
#include "rg_i_hash_table.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "frame/rg_i_trace.h"
#include "kt_ku.h"
#include "memory/rg_i_large_pages.h"

namespace
{

constexpr char module_version[] = "rg_i_hash_table 1.0";

// The built-in rule: the low 14 bits of the last word of a resource handle.
constexpr kt_uint32_t handle_buckets     = 16384;
constexpr std::size_t handle_hash_offset = offsetof(kt_resource_handle_t, id) + offsetof(kt_resource_id_t, id4);
static_assert(handle_hash_offset == 16);

constexpr kt_uint32_t qualifier_kind_mask = 15;

using element_t = rg_hash_table_element_t;

// The first element of the bucket whose key equals this one, or NULL. `foresee` is told the row of each element ahead of
// the comparison, which has to wait for the key.
template <class Foresee>
[[nodiscard]] element_t * find_key(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket, kt_char_ptr_t p_key_value,
                                   Foresee && foresee)
{
    // Where a bucket has one element, it mostly stands in the place: fetched beside the head, not behind it.
    __builtin_prefetch(&p_hash_table->p_places[bucket]);
    element_t * p_element = p_hash_table->p_elements[bucket];
    for (; p_element != nullptr; p_element = p_element->p_next) {
        foresee(p_element->row_index);
        if (p_hash_table->p_compare_function(p_element->p_key_value, p_key_value) == 0)
            break;
    }
    return p_element;
}

[[nodiscard]] element_t * find_key(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket, kt_char_ptr_t p_key_value)
{
    return find_key(p_hash_table, bucket, p_key_value, [](kt_uint32_t) {});
}

// An array of one entry a bucket. It is read at random, wherever the keys' hash values lead.
template <class T> [[nodiscard]] T * make_bucket_array(std::size_t buckets)
{
    auto * const p_array = static_cast<T *>(std::calloc(buckets, sizeof(T)));
    if (p_array != nullptr)
        rg_i_prefer_large_pages(p_array, buckets * sizeof(T));
    return p_array;
}

// Memory for an element that will stand in this bucket, or NULL.
[[nodiscard]] element_t * make_element(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket)
{
    if (p_hash_table->p_elements[bucket] == nullptr)
        return &p_hash_table->p_places[bucket];
    return static_cast<element_t *>(std::malloc(sizeof(element_t)));
}

void free_element(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket, element_t * p_element)
{
    if (p_element != &p_hash_table->p_places[bucket])
        std::free(p_element);
}

// The link of the bucket that leads to this element, or to its end.
element_t ** link_to_element(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket, const element_t * p_element)
{
    element_t ** p_link = &p_hash_table->p_elements[bucket];
    while (*p_link != nullptr && *p_link != p_element)
        p_link = &(*p_link)->p_next;
    return p_link;
}

} // namespace

kt_int32_t rg_i_hash_table_open(kt_uint32_t total_hash_buckets, rg_hash_function_t * p_hash_function,
                                rg_hash_keys_compare_function_t * p_compare_function, rg_hash_table_t ** p_hash_table)
{
    if (p_hash_function == nullptr) {
        total_hash_buckets = handle_buckets;
        p_compare_function = ku_rsrc_hndl_cmp_1;
    }
    // A table without buckets refuses every key; it still owns its arrays.
    const std::size_t array_length = std::max<std::size_t>(total_hash_buckets, 1);
    auto * const      p_elements   = make_bucket_array<element_t *>(array_length);
    auto * const      p_places     = make_bucket_array<element_t>(array_length);
    auto * const      p_table      = static_cast<rg_hash_table_t *>(std::malloc(sizeof(rg_hash_table_t)));
    if (p_elements == nullptr || p_places == nullptr || p_table == nullptr) {
        std::free(p_elements);
        std::free(p_places);
        std::free(p_table);
        return rg_i_fail_no_memory(RG_HERE);
    }
    *p_table      = {total_hash_buckets, p_hash_function, p_compare_function, p_elements, p_places};
    *p_hash_table = p_table;
    return 0;
}

kt_int32_t rg_i_hash_table_close(rg_hash_table_t * p_hash_table)
{
    if (p_hash_table == nullptr)
        return 0;
    for (kt_uint32_t bucket = 0; bucket < p_hash_table->total_hash_buckets; ++bucket)
        for (element_t * p_element = p_hash_table->p_elements[bucket]; p_element != nullptr;)
            free_element(p_hash_table, bucket, std::exchange(p_element, p_element->p_next));
    std::free(p_hash_table->p_elements);
    std::free(p_hash_table->p_places);
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

void rg_i_hash_table_fetch_bucket(const rg_hash_table_t * p_hash_table, kt_uint32_t bucket)
{
    if (bucket >= p_hash_table->total_hash_buckets)
        return;
    __builtin_prefetch(&p_hash_table->p_elements[bucket], 1);
    __builtin_prefetch(&p_hash_table->p_places[bucket], 1);
}

kt_int32_t rg_i_hash_table_add(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value, kt_uint32_t row_index,
                               kt_uint32_t * p_hash_index, rg_hash_table_element_t ** p_p_hash_table_element,
                               rg_qualifier_t qualifier)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    const kt_int32_t  rc =
        rg_i_hash_table_add_to_bucket(p_hash_table, bucket, p_key_value, row_index, p_p_hash_table_element, qualifier);
    if (rc == 0)
        *p_hash_index = bucket;
    return rc;
}

kt_int32_t rg_i_hash_table_add_to_bucket(rg_hash_table_t * p_hash_table, kt_uint32_t bucket, kt_char_ptr_t p_key_value,
                                         kt_uint32_t row_index, rg_hash_table_element_t ** p_p_hash_table_element,
                                         rg_qualifier_t qualifier)
{
    const rg_i_site_t here{"rg_i_hash_table_add", __LINE__, __FILE_NAME__, module_version}; // one call to a user
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(here);

    auto * const p_element = make_element(p_hash_table, bucket);
    if (p_element == nullptr)
        return rg_i_fail_no_memory(here);

    if ((qualifier & qualifier_kind_mask) == RG_PRIMARY_KEY) {
        if (element_t * const p_equal = find_key(p_hash_table, bucket, p_key_value); p_equal != nullptr) {
            free_element(p_hash_table, bucket, p_element);
            *p_p_hash_table_element = p_equal;
            return RG_E_DUPLICATE_KEY; // no error record: the other row may be about to be deleted
        }
    }

    // Nothing below fails.
    *p_element                       = {row_index, p_key_value, p_hash_table->p_elements[bucket]};
    p_hash_table->p_elements[bucket] = p_element;
    *p_p_hash_table_element          = p_element;
    return 0;
}

kt_int32_t rg_i_hash_table_get_index(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value, kt_uint32_t * row_index,
                                     kt_char_ptr_t ** p_p_p_key_value)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    element_t * const p_element = find_key(p_hash_table, bucket, p_key_value);
    if (p_element == nullptr)
        return RG_E_NO_SUCH_KEY; // no error record: the caller knows the table's name, and reports
    *row_index       = p_element->row_index;
    *p_p_p_key_value = &p_element->p_key_value;
    return 0;
}

kt_int32_t rg_i_hash_table_get_index_and_fetch(const rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value,
                                               kt_uint32_t * row_index, const void * p_entries, size_t entry_length)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal({"rg_i_hash_table_get_index", __LINE__, __FILE_NAME__, module_version}); // as there

    const element_t * const p_element = find_key(p_hash_table, bucket, p_key_value, [=](kt_uint32_t row) {
        __builtin_prefetch(static_cast<const char *>(p_entries) + row * entry_length);
    });
    if (p_element == nullptr)
        return RG_E_NO_SUCH_KEY;
    *row_index = p_element->row_index;
    return 0;
}

kt_int32_t rg_i_hash_table_remove(rg_hash_table_t * p_hash_table, kt_char_ptr_t p_key_value)
{
    const kt_uint32_t bucket = rg_i_hash_table_bucket(p_hash_table, p_key_value);
    if (bucket >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    element_t * const p_element = find_key(p_hash_table, bucket, p_key_value);
    if (p_element == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    return rg_i_hash_table_remove_element(p_hash_table, bucket, p_element);
}

kt_int32_t rg_i_hash_table_remove_element(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index,
                                          rg_hash_table_element_t * p_hash_table_element)
{
    if (hash_index >= p_hash_table->total_hash_buckets)
        return rg_i_fail_internal(RG_HERE);

    element_t ** const p_link = link_to_element(p_hash_table, hash_index, p_hash_table_element);
    if (*p_link == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    *p_link = p_hash_table_element->p_next;
    free_element(p_hash_table, hash_index, p_hash_table_element);
    return 0;
}

kt_int32_t rg_i_hash_table_own_key(rg_hash_table_t * p_hash_table, kt_uint32_t hash_index, kt_uint32_t key_length,
                                   rg_hash_table_element_t ** p_p_hash_table_element)
{
    element_t ** const p_link   = link_to_element(p_hash_table, hash_index, *p_p_hash_table_element);
    element_t * const  p_former = *p_link;
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
    free_element(p_hash_table, hash_index, p_former);
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
