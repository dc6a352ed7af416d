// SPDX-License-Identifier: MIT
// rg_i_application_metadata: the small sorted set of binaries that belongs to the application and commits with the
// rows.
//
// Layer: schema. Called by the creation, opening and closing of tables, by apply, commit and abort, and by the two
// calls of the interface, which use element type 0 alone.
// Always holds: the index ascends by type. An element without a pending change has both pointers at one version.
// Locking: the table's lock: write for changes, read for getting.
// Failure: a new version is made before anything else changes; the set is as it was.
#include "rg_i_application_metadata.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"

namespace
{

constexpr char module_version[] = "rg_i_application_metadata 1.0";

using element_t = rg_i_application_metadata_index_element_t;

constexpr size_t length_word = sizeof(kt_uint32_t);

// A version is a kt_binary_t to whoever gets it, so it is never smaller than one.
[[nodiscard]] size_t version_size(kt_uint32_t length)
{
    return std::max(length_word + length, sizeof(kt_binary_t));
}

[[nodiscard]] kt_int32_t make_version(kt_uint32_t length, const kt_char_t * p_data, kt_char_ptr_t * p_p_version)
{
    if (p_data == nullptr && length > 0)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    auto * p_version = static_cast<kt_char_ptr_t>(std::malloc(version_size(length)));
    if (p_version == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    rg_i_store_u32(p_version, length);
    if (length > 0)
        std::memcpy(p_version + length_word, p_data, length);
    *p_p_version = p_version;
    return 0;
}

// The first element whose type isn't below the one sought. The set is so small that a walk is the fastest search.
[[nodiscard]] kt_uint32_t position_for(const rg_i_application_metadata_t * p_set, kt_uint32_t type)
{
    // Elements come in ascending order when a table is opened: a long set is filled without a walk for each.
    if (p_set->total_elements > 0 && p_set->p_index[p_set->total_elements - 1].type < type)
        return p_set->total_elements;
    kt_uint32_t position = 0;
    while (position < p_set->total_elements && p_set->p_index[position].type < type)
        ++position;
    return position;
}

// NULL if there is none.
[[nodiscard]] element_t * find(const rg_i_application_metadata_t * p_set, kt_uint32_t type)
{
    const kt_uint32_t position = position_for(p_set, type);
    if (position == p_set->total_elements || p_set->p_index[position].type != type)
        return nullptr;
    return &p_set->p_index[position];
}

// Frees one of the two versions, unless it is the other as well.
void free_unless(kt_char_ptr_t p_version, const kt_char_t * p_other)
{
    if (p_version != p_other)
        std::free(p_version);
}

[[nodiscard]] kt_int32_t make_room(rg_i_application_metadata_t * p_set)
{
    if (p_set->total_elements < p_set->max_elements)
        return 0;
    const kt_uint64_t max_elements = std::max(kt_uint64_t{p_set->max_elements} * 2, kt_uint64_t{1});
    if (max_elements > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE);
    auto * p_index = static_cast<element_t *>(std::realloc(p_set->p_index, max_elements * sizeof(element_t)));
    if (p_index == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    std::memset(static_cast<void *>(p_index + p_set->max_elements), 0,
                (max_elements - p_set->max_elements) * sizeof *p_index);
    p_set->p_index      = p_index;
    p_set->max_elements = static_cast<kt_uint32_t>(max_elements);
    return 0;
}

// The version that a reader sees.
[[nodiscard]] kt_int32_t visible_version(const rg_i_application_metadata_t * p_set, kt_uint32_t type,
                                         kt_uint32_t uncommitted_updates_visible, const kt_char_t ** p_p_version)
{
    const element_t * p_element = find(p_set, type);
    if (p_element == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    const kt_char_t * p_version = uncommitted_updates_visible != 0 ? p_element->p_applied : p_element->p_committed;
    if (p_version == nullptr)
        return rg_i_fail(RG_HERE, uncommitted_updates_visible != 0 ? RG_E_ROW_DELETED : RG_E_NO_SUCH_KEY);
    *p_p_version = p_version;
    return 0;
}

// Keeps the elements that `settle` says stay, in their order.
template <class Settle> void settle_all(rg_i_application_metadata_t * p_set, Settle settle)
{
    kt_uint32_t kept = 0;
    for (kt_uint32_t position = 0; position < p_set->total_elements; ++position) {
        element_t & element = p_set->p_index[position];
        if (settle(element))
            p_set->p_index[kept++] = element;
    }
    p_set->total_elements = kept;
}

} // namespace

kt_int32_t rg_i_allocate_application_metadata_buffer(kt_uint32_t                    max_elements,
                                                     rg_i_application_metadata_t ** p_application_metadata)
{
    owned_ptr<rg_i_application_metadata_t> set(
        static_cast<rg_i_application_metadata_t *>(std::malloc(sizeof(rg_i_application_metadata_t))));
    if (!set)
        return rg_i_fail_no_memory(RG_HERE);
    set->max_elements   = max_elements;
    set->total_elements = 0;
    set->p_index        = nullptr;
    if (max_elements > 0) {
        set->p_index = static_cast<element_t *>(std::malloc(max_elements * sizeof(element_t)));
        if (set->p_index == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
    }
    *p_application_metadata = set.release();
    return 0;
}

kt_int32_t rg_i_free_application_metadata(rg_i_application_metadata_t * p_application_metadata)
{
    if (p_application_metadata == nullptr)
        return 0;
    settle_all(p_application_metadata, [](element_t & element) {
        free_unless(element.p_applied, element.p_committed);
        std::free(element.p_committed);
        return false;
    });
    std::free(p_application_metadata->p_index);
    std::free(p_application_metadata);
    return 0;
}

kt_int32_t rg_i_add_application_metadata_element(rg_i_application_metadata_t * p_application_metadata, kt_uint32_t type,
                                                 kt_uint32_t length, kt_char_ptr_t p_data)
{
    // Kept because callers depend on it: an element with a pending deletion still refuses an add. Setting revives it.
    if (find(p_application_metadata, type) != nullptr)
        return rg_i_fail(RG_HERE, RG_E_DUPLICATE_KEY);
    owned_buffer version;
    if (const kt_int32_t rc = make_version(length, p_data, version.out()); rc != 0)
        return rc;
    if (const kt_int32_t rc = make_room(p_application_metadata); rc != 0)
        return rc;

    // Nothing below fails.
    const kt_uint32_t position   = position_for(p_application_metadata, type);
    element_t *       p_position = p_application_metadata->p_index + position;
    std::memmove(p_position + 1, p_position, (p_application_metadata->total_elements - position) * sizeof *p_position);
    *p_position = {type, version.release(), nullptr};
    ++p_application_metadata->total_elements;
    return 0;
}

kt_int32_t rg_i_set_application_metadata_element(rg_i_application_metadata_t * p_application_metadata, kt_uint32_t type,
                                                 kt_uint32_t length, kt_char_ptr_t p_data)
{
    element_t * p_element = find(p_application_metadata, type);
    if (p_element == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    kt_char_ptr_t p_version = nullptr;
    if (const kt_int32_t rc = make_version(length, p_data, &p_version); rc != 0)
        return rc;

    free_unless(p_element->p_applied, p_element->p_committed);
    p_element->p_applied = p_version;
    return 0;
}

kt_int32_t rg_i_delete_application_metadata_element(rg_i_application_metadata_t * p_application_metadata,
                                                    kt_uint32_t                   type)
{
    element_t * p_element = find(p_application_metadata, type);
    if (p_element == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NO_SUCH_KEY);
    if (p_element->p_applied == nullptr)
        return 0;
    free_unless(p_element->p_applied, p_element->p_committed);
    p_element->p_applied = nullptr;
    return 0;
}

kt_int32_t rg_i_get_application_metadata_element(rg_i_application_metadata_t * p_application_metadata, kt_uint32_t type,
                                                 kt_uint32_t uncommitted_updates_visible, kt_uint32_t * p_length,
                                                 kt_char_ptr_t * p_data)
{
    const kt_char_t * p_version = nullptr;
    if (const kt_int32_t rc = visible_version(p_application_metadata, type, uncommitted_updates_visible, &p_version);
        rc != 0)
        return rc;
    const kt_uint32_t length = rg_i_load_u32(p_version);
    auto *            p_copy = static_cast<kt_char_ptr_t>(std::malloc(std::max<size_t>(length, 1)));
    if (p_copy == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(p_copy, p_version + length_word, length);
    *p_length = length;
    *p_data   = p_copy;
    return 0;
}

kt_int32_t rg_i_get_application_metadata_element_binary(rg_i_application_metadata_t * p_application_metadata,
                                                        kt_uint32_t type, kt_uint32_t uncommitted_updates_visible,
                                                        kt_binary_ptr_t * p_p_binary)
{
    const kt_char_t * p_version = nullptr;
    if (const kt_int32_t rc = visible_version(p_application_metadata, type, uncommitted_updates_visible, &p_version);
        rc != 0)
        return rc;
    const kt_uint32_t length = rg_i_load_u32(p_version);
    auto *            p_copy = std::malloc(version_size(length));
    if (p_copy == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    std::memcpy(p_copy, p_version, length_word + length);
    *p_p_binary = static_cast<kt_binary_ptr_t>(p_copy);
    return 0;
}

kt_int32_t rg_i_commit_application_metadata_buffer_updates(rg_i_application_metadata_t * p_application_metadata)
{
    settle_all(p_application_metadata, [](element_t & element) {
        free_unless(element.p_committed, element.p_applied);
        element.p_committed = element.p_applied;
        return element.p_applied != nullptr;
    });
    return 0;
}

kt_int32_t rg_i_abort_application_metadata_buffer_updates(rg_i_application_metadata_t * p_application_metadata)
{
    settle_all(p_application_metadata, [](element_t & element) {
        free_unless(element.p_applied, element.p_committed);
        element.p_applied = element.p_committed;
        return element.p_committed != nullptr;
    });
    return 0;
}

kt_int32_t rg_i_set_application_metadata(rg_i_application_metadata_t * p_application_metadata, kt_uint32_t type,
                                         kt_uint32_t length, kt_char_ptr_t p_data)
{
    const kt_int32_t rc = rg_i_set_application_metadata_element(p_application_metadata, type, length, p_data);
    if (rc != RG_E_NO_SUCH_KEY)
        return rc;
    return rg_i_add_application_metadata_element(p_application_metadata, type, length, p_data);
}

// Stands ready; elements set ahead of a failure stay set.
kt_int32_t rg_i_set_application_metadata_v(rg_i_application_metadata_t * p_application_metadata,
                                           kt_uint32_t array_count, va_list ap)
{
    for (kt_uint32_t i = 0; i < array_count; ++i) {
        const kt_uint32_t type   = va_arg(ap, kt_uint32_t);
        const kt_uint32_t length = va_arg(ap, kt_uint32_t);
        kt_char_ptr_t     p_data = va_arg(ap, kt_char_ptr_t);

        const kt_int32_t set_rc = rg_i_set_application_metadata_element(p_application_metadata, type, length, p_data);
        if (set_rc == 0)
            continue;
        if (set_rc < RG_E_NO_SUCH_KEY)
            return set_rc;
        if (const kt_int32_t rc = rg_i_add_application_metadata_element(p_application_metadata, type, length, p_data);
            rc != 0)
            return rc;
    }
    return 0;
}

// Stands ready: rg_i_get_application_metadata_element with its arguments in another order.
kt_int32_t rg_i_get_application_metadata(rg_i_application_metadata_t * p_application_metadata,
                                         kt_uint32_t uncommitted_updates_visible, kt_uint32_t type,
                                         kt_uint32_t * p_length, kt_char_ptr_t * p_data)
{
    return rg_i_get_application_metadata_element(p_application_metadata, type, uncommitted_updates_visible, p_length,
                                                 p_data);
}

kt_int32_t rg_i_duplicate_application_metadata_buffer(rg_i_application_metadata_t *  p_application_metadata,
                                                      rg_i_application_metadata_t ** p_p_to_application_metadata)
{
    rg_i_application_metadata_t * p_copy = nullptr;
    if (const kt_int32_t rc = rg_i_allocate_application_metadata_buffer(p_application_metadata->max_elements, &p_copy);
        rc != 0)
        return rc;
    rollback free_copy([&] { rg_i_free_application_metadata(p_copy); });

    for (kt_uint32_t position = 0; position < p_application_metadata->total_elements; ++position) {
        const element_t & element = p_application_metadata->p_index[position];
        if (element.p_committed == nullptr)
            continue; // not part of the committed state
        if (const kt_int32_t rc = rg_i_add_application_metadata_element(
                p_copy, element.type, rg_i_load_u32(element.p_committed), element.p_committed + length_word);
            rc != 0)
            return rc;
    }
    rg_i_commit_application_metadata_buffer_updates(p_copy);
    free_copy.dismiss();
    *p_p_to_application_metadata = p_copy;
    return 0;
}
