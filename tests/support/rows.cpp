// SPDX-License-Identifier: MIT
// rows: see rows.h.
#include "support/rows.h"

#include <algorithm>

namespace kt_test
{

namespace
{

void look_at_pool(const rg_i_record_buffer_pool_t & pool, table_picture & picture)
{
    std::vector<const char *> free_records;
    std::vector<const char *> chain;
    kt_uint32_t               heads = 0;
    for (const rg_i_record_buffer_t * p_block = pool.p_first_record_buffer; p_block != nullptr;
         p_block                              = p_block->p_next) {
        const char * p_record = reinterpret_cast<const char *>(p_block) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
        const char * p_end    = reinterpret_cast<const char *>(p_block) + p_block->total_bytes;
        heads += RG_I_RECORD_BUFFER_HEAD_LENGTH;
        while (p_record < p_end) {
            rg_i_record_metadata_t head; // a copy: heads lie at any alignment
            std::memcpy(&head, p_record, sizeof head);
            ASSERT_GE(+head.record_length, RG_I_RECORD_HEAD_LENGTH);
            if (head.type == RG_RECORD_TYPE_FREE) {
                free_records.push_back(p_record);
                heads += RG_I_RECORD_HEAD_LENGTH;
            } else {
                picture.taken_bytes += head.record_length;
            }
            p_record += head.record_length;
        }
        ASSERT_EQ(p_record, p_end) << "records tile their block";
    }
    for (const char * p = pool.p_free_chain; p != nullptr;
         p              = reinterpret_cast<const rg_i_record_metadata_t *>(p)->p_next) {
        ASSERT_TRUE(chain.empty() || chain.back() < p) << "the chain ascends";
        chain.push_back(p);
    }
    std::sort(free_records.begin(), free_records.end());
    ASSERT_EQ(chain, free_records) << "the chain is the free records";
    ASSERT_EQ(pool.used_bytes, picture.taken_bytes + heads);
}

void look_at_slots(const rg_i_table_t & table, table_picture & picture)
{
    std::vector<kt_uint32_t> chain;
    for (const rg_i_index_entry_t * p = table.p_rows_free_chain; p != nullptr;
         p                            = static_cast<const rg_i_index_entry_t *>(p->p_pending_change)) {
        chain.push_back(static_cast<kt_uint32_t>(p - table.p_rows_fixed_index));
        ASSERT_LE(chain.size(), table.maximum_rows);
    }
    ASSERT_TRUE(std::is_sorted(chain.begin(), chain.end()));
    for (kt_uint32_t slot = 0; slot < table.maximum_rows; ++slot) {
        const rg_i_index_entry_t & entry   = table.p_rows_fixed_index[slot];
        const bool                 is_free = std::binary_search(chain.begin(), chain.end(), slot);
        if (is_free) {
            ASSERT_EQ(entry.p_applied, nullptr);
            ASSERT_EQ(entry.p_committed, nullptr);
        } else {
            picture.slots.push_back(reinterpret_cast<const void *>(static_cast<std::uintptr_t>(slot)));
            picture.slots.push_back(entry.p_applied);
            picture.slots.push_back(entry.p_committed);
        }
    }
    ASSERT_EQ(picture.slots.size() / 3 + chain.size(), table.maximum_rows);
    ASSERT_EQ(picture.slots.size() / 3, table.total_applied_rows) << "each slot in use has a packed position";
    for (kt_uint32_t i = 0; i < table.total_applied_rows; ++i) {
        picture.packed_index.push_back(table.p_rows_packed_index[i]);
        ASSERT_EQ(table.p_rows_fixed_index[table.p_rows_packed_index[i]].packed_index, i);
    }
}

void look_at_list(const rg_i_table_t & table, const rg_i_change_entry_t * p_entry, kt_uint32_t deletion,
                  std::vector<kt_uint32_t> & list)
{
    for (; p_entry != nullptr; p_entry = p_entry->p_next) {
        ASSERT_EQ(+p_entry->deletion, deletion);
        ASSERT_TRUE(p_entry->p_index_entry->p_pending_change == p_entry);
        list.push_back(static_cast<kt_uint32_t>(p_entry->p_index_entry - table.p_rows_fixed_index));
    }
}

void look_at_hash_table(const rg_i_table_t & table, table_picture & picture)
{
    if (table.p_rows_hash_table == nullptr)
        return;
    for (kt_uint32_t bucket = 0; bucket < table.p_rows_hash_table->total_hash_buckets; ++bucket)
        for (const rg_hash_table_element_t * p = table.p_rows_hash_table->p_elements[bucket]; p != nullptr;
             p                                 = p->p_next) {
            picture.hashed.push_back(bucket);
            picture.hashed.push_back(p->row_index);
            ASSERT_TRUE(table.p_rows_fixed_index[p->row_index].p_hash_table_element == p);
            ASSERT_EQ(table.p_rows_fixed_index[p->row_index].hash_index, bucket);
        }
    ASSERT_EQ(picture.hashed.size() / 2, table.total_applied_rows);
}

} // namespace

table_picture picture_of(rg_opaque_handle_t handle)
{
    const rg_i_table_t & table = object_of(handle);
    table_picture        picture;
    look_at_pool(table.record_buffer_pool, picture);
    look_at_slots(table, picture);
    look_at_list(table, table.p_rows_change_list, 0, picture.updated);
    look_at_list(table, table.p_delete_rows_change_list, 1, picture.deleted);
    look_at_hash_table(table, picture);
    picture.applied_rows      = table.total_applied_rows;
    picture.committed_rows    = table.total_committed_rows;
    picture.applied_deletions = table.applied_deletions;
    picture.ready_for_commit  = table.ready_for_commit;
    return picture;
}

bool free_room_is_zero(rg_opaque_handle_t handle)
{
    rg_i_record_buffer_pool_t & pool       = object_of(handle).record_buffer_pool;
    kt_char_ptr_t               p_data     = nullptr;
    kt_char_ptr_t               p_previous = nullptr;
    kt_uint32_t                 length     = 0;
    EXPECT_EQ(rg_i_rb_find_suitable_record(&pool, 1, &p_data, &p_previous, &length), 0);
    return std::all_of(p_data, p_data + length, [](char c) { return c == 0; });
}

reading read_fixed(rg_opaque_handle_t table, kt_uint32_t fixed_index, const std::string & column, kt_uint32_t visible)
{
    reading r;
    r.rc = rg_get_field_by_fixed_index_and_visibility_1(table, static_cast<kt_int32_t>(fixed_index), text(column),
                                                        &r.value, visible, &r.state);
    return r;
}

reading read_packed(rg_opaque_handle_t table, kt_uint32_t packed_index, const std::string & column, kt_uint32_t visible)
{
    reading r;
    r.rc = rg_get_field_by_index_and_visibility_1(table, static_cast<kt_int32_t>(packed_index), text(column), &r.value,
                                                  visible, &r.state);
    return r;
}

reading read_key(rg_opaque_handle_t table, kt_value_t key, const std::string & column, kt_uint32_t visible)
{
    reading r;
    r.rc = rg_get_field_by_key_and_visibility_1(table, key, text(column), &r.value, visible, &r.state);
    return r;
}

std::string taken_string(const reading & r)
{
    if (r.rc != 0)
        return "<" + std::to_string(r.rc) + ">";
    std::string result = r.value.ptr_char;
    std::free(r.value.ptr_char);
    return result;
}

namespace
{

struct argument_arrays {
    explicit argument_arrays(std::initializer_list<named_value> given)
    {
        for (const named_value & v : given) {
            names.push_back(text(v.first));
            values.push_back(v.second);
        }
        for (kt_value_t & value : values)
            pointers.push_back(&value);
    }
    [[nodiscard]] kt_uint32_t count() const { return static_cast<kt_uint32_t>(names.size()); }

    std::vector<kt_char_ptr_t> names;
    std::vector<kt_value_t>    values;
    std::vector<kt_value_t *>  pointers;
};

} // namespace

kt_int32_t set_fields_by_fixed_index(rg_opaque_handle_t table, kt_uint32_t fixed_index,
                                     std::initializer_list<named_value> values)
{
    argument_arrays a(values);
    return rg_set_fields_by_fixed_index_1(table, static_cast<kt_int32_t>(fixed_index), a.names.data(),
                                          a.pointers.data(), a.count());
}

kt_int32_t set_fields_by_key(rg_opaque_handle_t table, kt_value_t key, std::initializer_list<named_value> values)
{
    argument_arrays a(values);
    return rg_set_fields_by_key_1(table, key, a.names.data(), a.pointers.data(), a.count());
}

kt_int32_t commit(rg_opaque_handle_t table)
{
    if (const kt_int32_t rc = rg_apply_1(table, 0); rc != 0)
        return rc;
    return rg_commit_1(table);
}

rg_row_state_t state_of(rg_opaque_handle_t table, kt_uint32_t fixed_index)
{
    return rg_i_get_row_state_for_fixed_index(&object_of(table), fixed_index);
}

std::int64_t find_key(rg_opaque_handle_t table, kt_value_t key)
{
    kt_uint32_t      fixed_index = 0;
    const kt_int32_t rc          = rg_get_fixed_row_index_for_key_1(table, key, &fixed_index);
    return rc == 0 ? std::int64_t{fixed_index} : -std::int64_t{rc};
}

} // namespace kt_test
