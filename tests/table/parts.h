// SPDX-License-Identifier: MIT
// parts: what the tests of table objects stand on: an object without a tree, and row records made by hand.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "rg_i_table.h"
#include "support/registry.h"

namespace kt_test
{

// The object behind a handle.
inline rg_i_table_t & object(rg_opaque_handle_t handle)
{
    return *static_cast<rg_i_table_t *>(handle);
}

// A transient table that no tree knows.
class lone_table
{
  public:
    explicit lone_table(std::vector<rg_column_t> columns, rg_hash_table_t * p_hash_table = nullptr)
    {
        EXPECT_EQ(rg_i_create_transient_table(nullptr, nullptr, columns.data(),
                                              static_cast<kt_uint32_t>(columns.size()), RG_MODE_EXPLICIT_CONTROL,
                                              p_hash_table, &p_table_),
                  0);
    }
    ~lone_table() { rg_i_close_table(p_table_); }
    lone_table(const lone_table &)               = delete;
    lone_table &   operator=(const lone_table &) = delete;
    rg_i_table_t * operator->() const { return p_table_; }
    rg_i_table_t * get() const { return p_table_; }

  private:
    rg_i_table_t * p_table_ = nullptr;
};

// A row record with these slots and this indirect data.
inline kt_char_ptr_t make_record(rg_i_table_t * p_table, const std::vector<kt_value_t> & slots,
                                 const std::string & indirect_data = "")
{
    const kt_uint32_t fixed_length = rg_i_row_fixed_length(p_table->total_columns);
    kt_char_ptr_t     p_data       = nullptr;
    EXPECT_EQ(rg_i_reserve_record(&p_table->record_buffer_pool,
                                  fixed_length + static_cast<kt_uint32_t>(indirect_data.size()), RG_RECORD_TYPE_ROW,
                                  &p_data),
              0);
    for (kt_uint32_t column = 0; column < slots.size(); ++column)
        std::memcpy(rg_i_row_slot(p_data, column), &slots[column], sizeof slots[column]);
    std::memcpy(p_data + fixed_length, indirect_data.data(), indirect_data.size());
    return p_data;
}

// A slot that says where an indirect value lies.
inline kt_value_t anchor(kt_uint32_t offset, kt_uint32_t length)
{
    const kt_pmsg_value_anchor_t where{offset, length};
    kt_value_t                   value;
    std::memcpy(&value, &where, sizeof value);
    return value;
}

// Takes the next slot for a committed row, as filling a table directly does.
inline rg_i_index_entry_t * put_committed(rg_i_table_t * p_table, kt_char_ptr_t p_record)
{
    rg_i_index_entry_t * p_entry = rg_i_rows_free_chain_remove(p_table);
    p_entry->p_applied           = p_record;
    p_entry->p_committed         = p_record;
    ++p_table->total_applied_rows;
    ++p_table->total_committed_rows;
    return p_entry;
}

// The free slots, in the order of the chain.
inline std::vector<kt_uint32_t> free_slots(const rg_i_table_t * p_table)
{
    std::vector<kt_uint32_t> slots;
    for (auto * p = p_table->p_rows_free_chain; p != nullptr;
         p        = static_cast<rg_i_index_entry_t *>(p->p_pending_change))
        slots.push_back(rg_i_fixed_row_index(p_table, p));
    return slots;
}

// The fixed indices on a change list, from its head; checks the links back on the way.
inline std::vector<kt_uint32_t> listed(const rg_i_table_t * p_table, kt_uint32_t deletion)
{
    std::vector<kt_uint32_t> rows;
    rg_i_change_entry_t *    p_before = nullptr;
    rg_i_change_entry_t *    p = deletion != 0 ? p_table->p_delete_rows_change_list : p_table->p_rows_change_list;
    for (; p != nullptr; p = p->p_next) {
        EXPECT_EQ(+p->p_prev, p_before); // packed fields are copied, not referred to
        EXPECT_EQ(+p->deletion, deletion);
        EXPECT_EQ(+p->p_index_entry->p_pending_change, p);
        rows.push_back(rg_i_fixed_row_index(p_table, p->p_index_entry));
        p_before = p;
    }
    EXPECT_EQ(deletion != 0 ? p_table->p_delete_rows_change_list_tail : p_table->p_rows_change_list_tail, p_before);
    return rows;
}

} // namespace kt_test
