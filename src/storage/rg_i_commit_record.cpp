// SPDX-License-Identifier: MIT
// rg_i_commit_record: makes a commit record, and reads one.
//
// Layer: storage. Called by creation, apply and open.
// Always holds: a commit record carries the whole of the application metadata; it stands nowhere else in a file.
// Locking: the caller holds the table's write lock, or no other thread can see the table yet.
// Failure: a record that can't be made is not there. A record that can't be read may have entered some of its elements;
// the table that they went to is closed then.
#include <cstdlib>
#include <cstring>

#include <algorithm>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"

namespace
{

constexpr char module_version[] = "rg_i_commit_record 1.0";

constexpr kt_uint32_t element_head_length = sizeof(rg_i_disk_application_metadata_element_t);

// The version of an element that a commit record carries, or NULL for an element with neither. A version is a u32
// length and the bytes.
[[nodiscard]] kt_char_ptr_t carried_version(const rg_i_application_metadata_index_element_t & element)
{
    return element.p_applied != nullptr ? element.p_applied : element.p_committed;
}

// Number and bytes of the elements that a commit record carries.
struct carried_elements_t {
    kt_uint32_t count = 0;
    kt_uint64_t bytes = 0;
};

[[nodiscard]] carried_elements_t measure(const rg_i_application_metadata_t * p_application_metadata)
{
    carried_elements_t carried;
    if (p_application_metadata == nullptr)
        return carried;
    for (kt_uint32_t i = 0; i < p_application_metadata->total_elements; ++i)
        if (const kt_char_t * p_version = carried_version(p_application_metadata->p_index[i]); p_version != nullptr) {
            ++carried.count;
            carried.bytes += element_head_length + rg_i_load_u32(p_version);
        }
    return carried;
}

// The elements of a commit record in memory: where they begin, how many there are, and where they must end.
struct stored_elements_t {
    kt_char_ptr_t     p_first = nullptr;
    kt_uint32_t       count   = 0;
    const kt_char_t * p_end   = nullptr;
};

// Finds the next element from p_element on. False: it leaves the record.
[[nodiscard]] bool read_element(const kt_char_t * p_element, const kt_char_t * p_end,
                                rg_i_disk_application_metadata_element_t * p_head)
{
    const size_t room = static_cast<size_t>(p_end - p_element);
    if (room < element_head_length)
        return false;
    *p_head = rg_i_load<rg_i_disk_application_metadata_element_t>(p_element);
    return p_head->length <= room - element_head_length;
}

// Whether all elements lie in the record; tells besides whether their types ascend, as those of every written one do.
[[nodiscard]] bool elements_fit(const stored_elements_t & stored, bool * p_ascending)
{
    const kt_char_t * p_element     = stored.p_first;
    kt_uint32_t       previous_type = 0;
    *p_ascending                    = true;
    for (kt_uint32_t i = 0; i < stored.count; ++i) {
        rg_i_disk_application_metadata_element_t head;
        if (!read_element(p_element, stored.p_end, &head))
            return false;
        *p_ascending  = *p_ascending && (i == 0 || head.type >= previous_type);
        previous_type = head.type;
        p_element += element_head_length + head.length;
    }
    return true;
}

[[nodiscard]] kt_int32_t add_element(rg_i_application_metadata_t * p_application_metadata, kt_char_ptr_t p_element)
{
    const auto head = rg_i_load<rg_i_disk_application_metadata_element_t>(p_element);
    return rg_i_add_application_metadata_element(p_application_metadata, head.type, head.length,
                                                 p_element + element_head_length);
}

[[nodiscard]] kt_int32_t add_in_file_order(rg_i_application_metadata_t * p_application_metadata,
                                           const stored_elements_t &     stored)
{
    kt_char_ptr_t p_element = stored.p_first;
    for (kt_uint32_t i = 0; i < stored.count; ++i) {
        if (const kt_int32_t rc = add_element(p_application_metadata, p_element); rc != 0)
            return rc;
        p_element += element_head_length + rg_i_load<rg_i_disk_application_metadata_element_t>(p_element).length;
    }
    return 0;
}

// Elements out of order stand in no file of ours. They are sorted ahead, since each of them would otherwise shift the
// index: a damaged record may not cost the square of its length.
[[nodiscard]] kt_int32_t add_in_type_order(rg_i_application_metadata_t * p_application_metadata,
                                           const stored_elements_t &     stored)
{
    struct place_t {
        kt_uint32_t type;
        kt_uint32_t offset;
    };
    owned_ptr<place_t> places(static_cast<place_t *>(std::malloc(stored.count * sizeof(place_t))));
    if (!places)
        return rg_i_fail_no_memory(RG_HERE);

    kt_uint32_t offset = 0;
    for (kt_uint32_t i = 0; i < stored.count; ++i) {
        const auto head = rg_i_load<rg_i_disk_application_metadata_element_t>(stored.p_first + offset);
        places.get()[i] = {head.type, offset};
        offset += element_head_length + head.length;
    }
    std::sort(places.get(), places.get() + stored.count, [](const place_t & a, const place_t & b) {
        return a.type != b.type ? a.type < b.type : a.offset < b.offset;
    });
    for (kt_uint32_t i = 0; i < stored.count; ++i)
        if (const kt_int32_t rc = add_element(p_application_metadata, stored.p_first + places.get()[i].offset); rc != 0)
            return rc;
    return 0;
}

} // namespace

kt_int32_t rg_i_create_commit_record(rg_i_application_metadata_t * p_application_metadata, kt_uint64_t change_counter,
                                     kt_uint32_t * p_commit_record_length, kt_char_ptr_t * p_p_commit_record)
{
    const carried_elements_t carried = measure(p_application_metadata);
    const kt_uint64_t        extra   = carried.count == 0 ? 0 : sizeof(kt_uint32_t) + carried.bytes;
    const kt_uint64_t        length  = sizeof(rg_i_disk_commit_record_t) + extra;
    if (length > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE); // no record can be this long
    auto * const p_record = static_cast<kt_char_ptr_t>(std::malloc(length));
    if (p_record == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    const auto record_length = static_cast<kt_uint32_t>(length);
    rg_i_store(p_record, rg_i_disk_commit_record_t{{record_length, 0, RG_RECORD_TYPE_COMMIT},
                                                   static_cast<kt_uint32_t>(sizeof change_counter + extra),
                                                   change_counter});
    if (carried.count != 0) {
        kt_char_ptr_t p = p_record + sizeof(rg_i_disk_commit_record_t);
        rg_i_store_u32(p, carried.count);
        p += sizeof carried.count;
        for (kt_uint32_t i = 0; i < p_application_metadata->total_elements; ++i) {
            const rg_i_application_metadata_index_element_t & element   = p_application_metadata->p_index[i];
            const kt_char_t *                                 p_version = carried_version(element);
            if (p_version == nullptr)
                continue;
            const size_t version_length = sizeof(kt_uint32_t) + rg_i_load_u32(p_version);
            rg_i_store_u32(p, element.type);
            std::memcpy(p + sizeof element.type, p_version, version_length);
            p += sizeof element.type + version_length;
        }
    }
    *p_commit_record_length = record_length;
    *p_p_commit_record      = p_record;
    return 0;
}

kt_int32_t rg_i_open_commit_record(kt_char_ptr_t p_commit_record, rg_i_application_metadata_t * p_application_metadata,
                                   kt_uint64_t * p_change_counter)
{
    // In memory the fields stand RG_I_MEMORY_RECORD_EXCESS bytes further on than in the file.
    const kt_uint32_t record_length = rg_i_load_u32(p_commit_record);
    if (record_length < sizeof(rg_i_disk_commit_record_t) + RG_I_MEMORY_RECORD_EXCESS)
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    const auto record = rg_i_load<rg_i_disk_commit_record_t>(p_commit_record + RG_I_MEMORY_RECORD_EXCESS);
    *p_change_counter = record.change_counter;
    if (record.commit_data_length <= sizeof record.change_counter)
        return 0;

    stored_elements_t stored;
    kt_char_ptr_t     p_count = p_commit_record + RG_I_MEMORY_RECORD_EXCESS + sizeof record;
    stored.p_end              = p_commit_record + record_length;
    if (static_cast<size_t>(stored.p_end - p_count) < sizeof stored.count)
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    stored.count   = rg_i_load_u32(p_count);
    stored.p_first = p_count + sizeof stored.count;
    bool ascending = true;
    if (!elements_fit(stored, &ascending))
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);

    if (const kt_int32_t rc = ascending ? add_in_file_order(p_application_metadata, stored)
                                        : add_in_type_order(p_application_metadata, stored);
        rc != 0)
        return rc;
    return rg_i_commit_application_metadata_buffer_updates(p_application_metadata);
}
