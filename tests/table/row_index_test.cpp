// SPDX-License-Identifier: MIT
// The row index of a table: slots, the free chain, growth, the change lists, and where a key lies in a record.
#include <algorithm>
#include <numeric>
#include <random>

#include "parts.h"
#include "support/faults.h"

using namespace kt_test;

namespace
{

std::vector<rg_column_t> number_columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("value", KT_INT64)};
}

std::vector<rg_column_t> string_columns(rg_qualifier_t qualifier = RG_PRIMARY_KEY)
{
    return {column("name", KT_CHAR_PTR, qualifier, null_value()), column("value", KT_INT64)};
}

std::vector<kt_uint32_t> slots_from(kt_uint32_t first, kt_uint32_t end)
{
    std::vector<kt_uint32_t> slots(end - first);
    std::iota(slots.begin(), slots.end(), first);
    return slots;
}

rg_hash_table_t * open_string_hash_table()
{
    rg_hash_table_t * p_hash_table = nullptr;
    EXPECT_EQ(rg_i_hash_table_open(1024, hash_string, compare_string, &p_hash_table), 0);
    return p_hash_table;
}

} // namespace

// ---- Slots and the free chain ----

TEST(a_row_index, of_zero_rows_has_ten_slots)
{
    rg_i_table_t * p_table = nullptr;
    ASSERT_EQ(rg_i_create_null_table(&p_table), 0);
    ASSERT_EQ(rg_i_establish_rows_index(p_table, 0), 0);
    EXPECT_EQ(p_table->maximum_rows, 10u);
    EXPECT_EQ(free_slots(p_table), slots_from(0, 10));
    rg_i_close_table(p_table);
}

TEST(a_row_index, hands_out_its_slots_in_ascending_order_and_then_none)
{
    rg_i_table_t * p_table = nullptr;
    ASSERT_EQ(rg_i_create_null_table(&p_table), 0);
    ASSERT_EQ(rg_i_establish_rows_index(p_table, 70), 0);
    for (kt_uint32_t slot = 0; slot < 70; ++slot) {
        rg_i_index_entry_t * p_entry = rg_i_rows_free_chain_remove(p_table);
        ASSERT_NE(p_entry, nullptr);
        EXPECT_EQ(rg_i_fixed_row_index(p_table, p_entry), slot);
        EXPECT_EQ(+p_entry->p_pending_change, nullptr);
    }
    EXPECT_EQ(rg_i_rows_free_chain_remove(p_table), nullptr);
    rg_i_close_table(p_table);
}

TEST(a_row_index, without_memory_keeps_what_it_has_for_closing)
{
    for (unsigned nth = 1; nth <= 2; ++nth) {
        fault_scope    faults;
        rg_i_table_t * p_table = nullptr;
        ASSERT_EQ(rg_i_create_null_table(&p_table), 0);
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(rg_i_establish_rows_index(p_table, 100), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(p_table->maximum_rows, 0u);
        rg_i_close_table(p_table);
    }
}

TEST(a_freed_slot, is_zeroed_and_takes_its_place_in_the_ascending_chain)
{
    lone_table table(number_columns());
    for (int i = 0; i < 10; ++i)
        ASSERT_NE(rg_i_rows_free_chain_remove(table.get()), nullptr);
    for (const kt_uint32_t slot : {5u, 2u, 9u, 3u}) {
        rg_i_index_entry_t * p_entry = table->p_rows_fixed_index + slot;
        p_entry->file_offset         = 77;
        p_entry->packed_index        = 7;
        rg_i_rows_free_chain_insert(table.get(), p_entry);
        EXPECT_EQ(+p_entry->file_offset, 0u);
        EXPECT_EQ(+p_entry->packed_index, 0u);
    }
    std::vector<kt_uint32_t> expected = slots_from(10, 100);
    expected.insert(expected.begin(), {2, 3, 5, 9});
    EXPECT_EQ(free_slots(table.get()), expected);
    EXPECT_EQ(rg_i_fixed_row_index(table.get(), rg_i_rows_free_chain_remove(table.get())), 2u);
}

TEST(a_freed_slot, that_is_free_already_stays_where_it_is)
{
    lone_table table(number_columns());
    rg_i_rows_free_chain_insert(table.get(), table->p_rows_fixed_index + 40);
    EXPECT_EQ(free_slots(table.get()), slots_from(0, 100));
}

TEST(freed_slots, stay_ascending_whatever_the_order_they_come_and_go)
{
    lone_table               table(number_columns());
    std::mt19937             random(3);
    std::vector<kt_uint32_t> used;
    for (int round = 0; round < 3000; ++round) {
        if (random() % 2 == 0) {
            const std::vector<kt_uint32_t> before  = free_slots(table.get());
            rg_i_index_entry_t *           p_entry = rg_i_rows_free_chain_remove(table.get());
            if (before.empty()) {
                ASSERT_EQ(p_entry, nullptr);
                continue;
            }
            ASSERT_EQ(rg_i_fixed_row_index(table.get(), p_entry), before.front());
            used.push_back(before.front());
        } else if (!used.empty()) {
            std::swap(used[random() % used.size()], used.back());
            rg_i_rows_free_chain_insert(table.get(), table->p_rows_fixed_index + used.back());
            used.pop_back();
        }
        const std::vector<kt_uint32_t> chain = free_slots(table.get());
        ASSERT_EQ(chain.size() + used.size(), 100u);
        ASSERT_TRUE(std::is_sorted(chain.begin(), chain.end()));
    }
}

TEST(freed_slots, of_a_million_rows_in_any_order_are_not_found_by_walking)
{
    const kt_uint32_t rows    = 1000000;
    rg_i_table_t *    p_table = nullptr;
    ASSERT_EQ(rg_i_create_null_table(&p_table), 0);
    ASSERT_EQ(rg_i_establish_rows_index(p_table, rows), 0);
    for (kt_uint32_t row = 0; row < rows; ++row)
        ASSERT_NE(rg_i_rows_free_chain_remove(p_table), nullptr);

    std::vector<kt_uint32_t> order = slots_from(0, rows);
    std::shuffle(order.begin(), order.end(), std::mt19937(5));
    for (const kt_uint32_t slot : order)
        rg_i_rows_free_chain_insert(p_table, p_table->p_rows_fixed_index + slot);
    EXPECT_EQ(free_slots(p_table), slots_from(0, rows));
    rg_i_close_table(p_table);
}

// ---- Growth ----

TEST(growing_an_index, adds_the_new_slots_as_the_free_chain_and_keeps_the_old_ones)
{
    lone_table table(number_columns());
    for (kt_uint32_t slot = 0; slot < 100; ++slot)
        rg_i_rows_free_chain_remove(table.get())->file_offset = slot + 1;
    table->p_rows_packed_index[99] = 42;

    ASSERT_EQ(rg_i_grow_index(table.get(), table->maximum_rows), 0);
    EXPECT_EQ(table->maximum_rows, 200u);
    EXPECT_EQ(free_slots(table.get()), slots_from(100, 200));
    EXPECT_EQ(table->p_rows_packed_index[99], 42u);
    for (kt_uint32_t slot = 0; slot < 100; ++slot)
        EXPECT_EQ(+table->p_rows_fixed_index[slot].file_offset, slot + 1);
    for (kt_uint32_t slot = 100; slot < 200; ++slot)
        EXPECT_EQ(+table->p_rows_fixed_index[slot].file_offset, 0u);

    rg_i_rows_free_chain_insert(table.get(), table->p_rows_fixed_index + 17);
    EXPECT_EQ(rg_i_fixed_row_index(table.get(), rg_i_rows_free_chain_remove(table.get())), 17u);
    EXPECT_EQ(rg_i_fixed_row_index(table.get(), rg_i_rows_free_chain_remove(table.get())), 100u);
}

TEST(growing_an_index, leads_pending_changes_of_both_lists_to_the_slots_new_place)
{
    lone_table table(number_columns());
    while (rg_i_rows_free_chain_remove(table.get()) != nullptr) {
    }
    for (const kt_uint32_t slot : {3u, 99u, 0u})
        ASSERT_EQ(rg_i_common_add_change_entry(table.get(), table->p_rows_fixed_index + slot, 0), 0);
    for (const kt_uint32_t slot : {50u, 7u})
        ASSERT_EQ(rg_i_common_add_change_entry(table.get(), table->p_rows_fixed_index + slot, 1), 0);

    // A new block behind the old one keeps realloc from growing it in place.
    for (int round = 0; round < 4; ++round) {
        void * p_obstacle = std::malloc(64);
        ASSERT_EQ(rg_i_grow_index(table.get(), table->maximum_rows), 0);
        std::free(p_obstacle);
        while (rg_i_rows_free_chain_remove(table.get()) != nullptr) {
        }
        EXPECT_EQ(listed(table.get(), 0), (std::vector<kt_uint32_t>{3, 99, 0}));
        EXPECT_EQ(listed(table.get(), 1), (std::vector<kt_uint32_t>{50, 7}));
    }
}

TEST(growing_an_index, that_finds_no_memory_keeps_both_arrays_usable)
{
    for (unsigned nth = 1; nth <= 2; ++nth) {
        fault_scope faults;
        lone_table  table(number_columns());
        for (kt_uint32_t slot = 0; slot < 100; ++slot) {
            rg_i_rows_free_chain_remove(table.get())->file_offset = slot + 1;
            table->p_rows_packed_index[slot]                      = 99 - slot;
        }
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(rg_i_grow_index(table.get(), 100), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(table->maximum_rows, 100u);
        for (kt_uint32_t slot = 0; slot < 100; ++slot) {
            EXPECT_EQ(+table->p_rows_fixed_index[slot].file_offset, slot + 1);
            EXPECT_EQ(table->p_rows_packed_index[slot], 99 - slot);
        }
        reset_calls();
        ASSERT_EQ(rg_i_grow_index(table.get(), 100), 0);
        EXPECT_EQ(free_slots(table.get()), slots_from(100, 200));
    }
}

TEST(growing_an_index, beyond_what_32_bits_can_number_finds_no_memory)
{
    lone_table table(number_columns());
    while (rg_i_rows_free_chain_remove(table.get()) != nullptr) {
    }
    EXPECT_EQ(rg_i_grow_index(table.get(), 0xFFFFFFFFu), RG_E_NO_MEMORY);
    EXPECT_EQ(table->maximum_rows, 100u);
}

// ---- Change lists ----

TEST(a_change, is_listed_once_and_keeps_its_place)
{
    lone_table table(number_columns());
    auto *     p_slots = table->p_rows_fixed_index;
    for (int i = 0; i < 3; ++i)
        rg_i_rows_free_chain_remove(table.get());
    for (const int slot : {1, 0, 2, 1, 0})
        ASSERT_EQ(rg_i_add_change_entry(table.get(), p_slots + slot), 0);
    EXPECT_EQ(listed(table.get(), 0), (std::vector<kt_uint32_t>{1, 0, 2}));
    EXPECT_EQ(listed(table.get(), 1), std::vector<kt_uint32_t>{});
}

TEST(a_change, moves_to_the_tail_of_the_other_list_without_an_allocation)
{
    fault_scope faults;
    lone_table  table(number_columns());
    auto *      p_slots = table->p_rows_fixed_index;
    for (int i = 0; i < 4; ++i) {
        rg_i_rows_free_chain_remove(table.get());
        ASSERT_EQ(rg_i_add_change_entry(table.get(), p_slots + i), 0);
    }
    fail_call(call::allocation, 1, ENOMEM, for_good);
    ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + 1, 1), 0); // from the middle
    ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + 0, 1), 0); // from the head
    ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + 3, 1), 0); // from the tail
    EXPECT_EQ(listed(table.get(), 0), (std::vector<kt_uint32_t>{2}));
    EXPECT_EQ(listed(table.get(), 1), (std::vector<kt_uint32_t>{1, 0, 3}));
    ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + 2, 1), 0); // the last one of its list
    ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + 1, 0), 0);
    EXPECT_EQ(listed(table.get(), 0), (std::vector<kt_uint32_t>{1}));
    EXPECT_EQ(listed(table.get(), 1), (std::vector<kt_uint32_t>{0, 3, 2}));
}

TEST(a_change, that_finds_no_memory_leaves_both_lists_and_the_slot_as_they_were)
{
    fault_scope faults;
    lone_table  table(number_columns());
    auto *      p_slots = table->p_rows_fixed_index;
    rg_i_rows_free_chain_remove(table.get());
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_add_change_entry(table.get(), p_slots), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(+p_slots[0].p_pending_change, nullptr);
    EXPECT_EQ(listed(table.get(), 0), std::vector<kt_uint32_t>{});

    reset_calls();
    fail_call(call::allocation, 2, ENOMEM);
    std::vector<kt_uint32_t> changed;
    while (calls_made(call::allocation) < 2) { // until the entries of the first allocation are used up
        const auto slot = static_cast<kt_uint32_t>(changed.size());
        ASSERT_LT(slot, 100u);
        rg_i_rows_free_chain_remove(table.get());
        const kt_int32_t rc = rg_i_add_change_entry(table.get(), p_slots + slot);
        if (calls_made(call::allocation) < 2) {
            ASSERT_EQ(rc, 0);
            changed.push_back(slot);
            continue;
        }
        EXPECT_EQ(rc, RG_E_NO_MEMORY);
        EXPECT_EQ(+p_slots[slot].p_pending_change, nullptr);
    }
    EXPECT_GT(changed.size(), 1u);
    EXPECT_EQ(listed(table.get(), 0), changed);
}

TEST(change_entries, of_a_thousand_rows_take_few_allocations)
{
    fault_scope faults;
    lone_table  table(number_columns());
    reset_calls();
    std::vector<rg_i_index_entry_t> rows(1000);
    for (auto & row : rows)
        ASSERT_EQ(rg_i_add_change_entry(table.get(), &row), 0);
    EXPECT_LE(calls_made(call::allocation), 7u);
    rg_i_free_change_lists(table.get());
    EXPECT_EQ(table->p_change_chunks, nullptr);
}

TEST(freeing_the_change_lists, empties_both_and_leaves_the_slots_alone)
{
    lone_table table(number_columns());
    auto *     p_slots = table->p_rows_fixed_index;
    for (int i = 0; i < 2; ++i) {
        rg_i_rows_free_chain_remove(table.get());
        ASSERT_EQ(rg_i_common_add_change_entry(table.get(), p_slots + i, static_cast<kt_uint32_t>(i)), 0);
    }
    rg_i_free_change_lists(table.get());
    EXPECT_EQ(table->p_rows_change_list, nullptr);
    EXPECT_EQ(table->p_rows_change_list_tail, nullptr);
    EXPECT_EQ(table->p_delete_rows_change_list, nullptr);
    EXPECT_EQ(table->p_delete_rows_change_list_tail, nullptr);
    EXPECT_NE(+p_slots[0].p_pending_change, nullptr);
}

// ---- Secondary access ----

TEST(secondary_access, numbers_committed_rows_densely_and_passes_over_the_others)
{
    lone_table table(number_columns());
    for (kt_uint32_t i = 0; i < 5; ++i)
        put_committed(table.get(), make_record(table.get(), {uint32(i), int64(0)}));
    // Slots 1 and 3 hold nothing that is committed.
    for (const kt_uint32_t slot : {1u, 3u}) {
        rg_i_rb_free_record(&table->record_buffer_pool, table->p_rows_fixed_index[slot].p_committed);
        rg_i_rows_free_chain_insert(table.get(), table->p_rows_fixed_index + slot);
    }
    table->total_committed_rows = 3;
    ASSERT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
    const kt_uint32_t expected[] = {0, 2, 4};
    for (kt_uint32_t k = 0; k < 3; ++k) {
        EXPECT_EQ(table->p_rows_packed_index[k], expected[k]);
        EXPECT_EQ(+table->p_rows_fixed_index[expected[k]].packed_index, k);
    }
}

TEST(secondary_access, enters_each_key_into_the_hash_table)
{
    lone_table table(string_columns(), open_string_hash_table());
    put_committed(table.get(), make_record(table.get(), {anchor(0, 4), int64(0)}, std::string("abc\0", 4)));
    put_committed(table.get(), make_record(table.get(), {anchor(2, 3), int64(0)}, std::string("..de\0", 5)));
    ASSERT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
    for (kt_uint32_t row = 0; row < 2; ++row) {
        kt_uint32_t     found   = 99;
        kt_char_ptr_t * p_p_key = nullptr;
        ASSERT_EQ(rg_i_hash_table_get_index(table->p_rows_hash_table, text(row == 0 ? "abc" : "de"), &found, &p_p_key),
                  0);
        EXPECT_EQ(found, row);
        EXPECT_NE(+table->p_rows_fixed_index[row].p_hash_table_element, nullptr);
    }
}

TEST(secondary_access, stops_at_a_duplicate_key_without_an_error_record)
{
    lone_table table(string_columns(), open_string_hash_table());
    for (int i = 0; i < 2; ++i)
        put_committed(table.get(), make_record(table.get(), {anchor(0, 2), int64(0)}, std::string("k\0", 2)));
    ku_set_no_error_1();
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), 0);
}

TEST(secondary_access, takes_duplicates_where_keys_are_not_checked)
{
    lone_table table(string_columns(RG_PRIMARY_KEY_NOCHECK), open_string_hash_table());
    for (int i = 0; i < 2; ++i)
        put_committed(table.get(), make_record(table.get(), {anchor(0, 2), int64(0)}, std::string("k\0", 2)));
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
}

TEST(secondary_access, refuses_a_damaged_key_of_a_hashed_table)
{
    lone_table table(string_columns(), open_string_hash_table());
    put_committed(table.get(), make_record(table.get(), {anchor(4, 8), int64(0)}, std::string("abc\0", 4)));
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
}

TEST(secondary_access, doesnt_look_at_keys_without_a_hash_table)
{
    lone_table table(string_columns());
    put_committed(table.get(), make_record(table.get(), {anchor(4, 8), int64(0)}, std::string("abc\0", 4)));
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
}

TEST(secondary_access, ends_where_more_rows_are_counted_than_there_are)
{
    lone_table table(number_columns());
    put_committed(table.get(), make_record(table.get(), {uint32(1), int64(0)}));
    table->total_committed_rows = 2;
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), RG_E_TABLE_UNREADABLE);
    table->total_committed_rows = 0xFFFFFFFFu;
    EXPECT_EQ(rg_i_establish_secondary_row_access(table.get()), RG_E_TABLE_UNREADABLE);
}

// ---- Removing a row ----

TEST(removing_a_row, moves_the_last_packed_row_into_the_hole_and_frees_record_and_slot)
{
    lone_table  table(string_columns(), open_string_hash_table());
    const char  names[]      = "a\0b\0c\0";
    kt_uint32_t used_by_rows = 0;
    for (kt_uint32_t row = 0; row < 3; ++row) {
        const kt_uint32_t before = table->record_buffer_pool.used_bytes;
        put_committed(table.get(), make_record(table.get(), {anchor(0, 2), int64(0)}, std::string(names + 2 * row, 2)));
        used_by_rows = table->record_buffer_pool.used_bytes - before;
    }
    ASSERT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
    const kt_uint32_t before = table->record_buffer_pool.used_bytes;

    ASSERT_EQ(rg_i_remove_row(table.get(), table->p_rows_fixed_index + 0), 0);
    EXPECT_EQ(table->total_applied_rows, 2u);
    EXPECT_EQ(table->p_rows_packed_index[0], 2u);
    EXPECT_EQ(+table->p_rows_fixed_index[2].packed_index, 0u);
    EXPECT_EQ(table->p_rows_packed_index[1], 1u);
    EXPECT_EQ(free_slots(table.get())[0], 0u);
    EXPECT_EQ(before - table->record_buffer_pool.used_bytes, used_by_rows - RG_I_RECORD_HEAD_LENGTH)
        << "the head stays, as that of a free record";
    kt_uint32_t     found   = 0;
    kt_char_ptr_t * p_p_key = nullptr;
    EXPECT_EQ(rg_i_hash_table_get_index(table->p_rows_hash_table, text("a"), &found, &p_p_key), RG_E_NO_SUCH_KEY);

    ASSERT_EQ(rg_i_remove_row(table.get(), table->p_rows_fixed_index + 1), 0)
        << "the last packed row moves onto itself";
    ASSERT_EQ(rg_i_remove_row(table.get(), table->p_rows_fixed_index + 2), 0);
    EXPECT_EQ(table->total_applied_rows, 0u);
    EXPECT_EQ(free_slots(table.get()), slots_from(0, 100));
}

TEST(removing_a_row, frees_both_versions_where_they_differ)
{
    lone_table           table(number_columns());
    const kt_uint32_t    before  = table->record_buffer_pool.used_bytes;
    rg_i_index_entry_t * p_entry = put_committed(table.get(), make_record(table.get(), {uint32(1), int64(1)}));
    p_entry->p_applied           = make_record(table.get(), {uint32(1), int64(2)});
    ASSERT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
    ASSERT_EQ(rg_i_remove_row(table.get(), p_entry), 0);
    EXPECT_EQ(table->record_buffer_pool.used_bytes, before);
}

TEST(removing_a_row, that_no_packed_position_leads_to_touches_no_other_row)
{
    lone_table table(number_columns());
    for (kt_uint32_t i = 0; i < 2; ++i)
        put_committed(table.get(), make_record(table.get(), {uint32(i), int64(0)}));
    table->total_applied_rows = table->total_committed_rows = 0; // as a file counts that deletes one row twice
    ASSERT_EQ(rg_i_establish_secondary_row_access(table.get()), 0);
    ASSERT_EQ(rg_i_remove_row(table.get(), table->p_rows_fixed_index + 1), 0);
    EXPECT_EQ(table->total_applied_rows, 0u);
    EXPECT_EQ(free_slots(table.get())[0], 1u);
}

// ---- Keys in records ----

TEST(the_key_of_a_record, is_the_slot_of_a_direct_type)
{
    lone_table    table(number_columns());
    kt_char_ptr_t p_record = make_record(table.get(), {uint32(0x01020304), int64(0)});
    EXPECT_EQ(rg_i_row_key(table.get(), p_record), p_record + 4);
}

TEST(the_key_of_a_record, is_the_stored_text_of_a_string)
{
    lone_table    table(string_columns());
    kt_char_ptr_t p_record = make_record(table.get(), {anchor(3, 4), int64(0)}, std::string("xyzabc\0", 7));
    ASSERT_EQ(rg_i_row_key(table.get(), p_record), p_record + 20 + 3);
    EXPECT_STREQ(rg_i_row_key(table.get(), p_record), "abc");
}

TEST(the_key_of_a_record, is_none_where_the_anchor_leaves_the_record)
{
    lone_table        table(string_columns());
    const std::string indirect("abc\0", 4);
    kt_char_ptr_t     p_whole = make_record(table.get(), {anchor(0, 4), int64(0)}, indirect);
    const kt_uint32_t room    = rg_i_row_indirect_length(table.get(), p_whole);
    ASSERT_NE(rg_i_row_key(table.get(), p_whole), nullptr);
    const kt_uint32_t all = 0xFFFFFFFFu;
    for (const auto & [offset, length] : std::vector<std::pair<kt_uint32_t, kt_uint32_t>>{{room, 1},
                                                                                          {room + 1, 0},
                                                                                          {0, room + 1},
                                                                                          {1, room},
                                                                                          {all, 1},
                                                                                          {all, 2},
                                                                                          {1, all},
                                                                                          {all, all},
                                                                                          {0x80000000u, 0x80000000u}}) {
        kt_char_ptr_t p_record = make_record(table.get(), {anchor(offset, length), int64(0)}, indirect);
        ASSERT_EQ(rg_i_row_indirect_length(table.get(), p_record), room);
        EXPECT_EQ(rg_i_row_key(table.get(), p_record), nullptr) << offset << " " << length;
    }
}

TEST(the_key_of_a_record, is_none_for_a_string_without_its_terminator)
{
    lone_table table(string_columns());
    EXPECT_EQ(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 3), int64(0)}, std::string("abc\0", 4))),
              nullptr);
    EXPECT_EQ(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 0), int64(0)}, std::string("abc\0", 4))),
              nullptr);
}

TEST(the_key_of_a_record, is_none_for_a_handle_of_fewer_than_twenty_bytes)
{
    lone_table        table({column("h", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY, null_value())});
    const std::string image(20, 'x');
    EXPECT_NE(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 20)}, image)), nullptr);
    EXPECT_EQ(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 19)}, image)), nullptr);
    EXPECT_EQ(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 0)}, image)), nullptr);
}

TEST(the_key_of_a_record, is_none_for_a_type_that_no_key_can_have)
{
    lone_table table(string_columns());
    for (const kt_data_type_t type : {KT_BINARY_PTR, KT_SD_PTR, KT_SBS_PTR, KT_INT32_ARRAY, KT_SD_PTR_ARRAY}) {
        table->p_columns[0].type = type; // as only a damaged file says
        EXPECT_EQ(rg_i_row_key(table.get(), make_record(table.get(), {anchor(0, 20), int64(0)}, std::string(20, '\0'))),
                  nullptr);
    }
}

// ---- The small ones ----

TEST(an_empty_value, takes_the_place_of_a_null_pointer_of_each_indirect_type)
{
    for (kt_data_type_t type = KT_CHAR_PTR; type <= KT_SD_PTR_ARRAY; ++type) {
        kt_value_t from = null_value();
        kt_value_t to   = uint64(1);
        rg_i_dup_nonscalar_value(type, &from, &to);
        const void * p_expected = type == KT_CHAR_PTR          ? static_cast<const void *>(ku_ptr_empty_char_1)
                                  : type == KT_BINARY_PTR      ? static_cast<const void *>(ku_ptr_empty_binary_1)
                                  : type == KT_RSRC_HANDLE_PTR ? static_cast<const void *>(ku_ptr_invld_rsrc_hndl_1)
                                  : type == KT_SD_PTR          ? static_cast<const void *>(ku_ptr_empty_sd_1)
                                                               : static_cast<const void *>(ku_ptr_empty_array_1);
        EXPECT_EQ(to.ptr_char, p_expected) << type;
    }
    kt_value_t from = string("kept as it is");
    kt_value_t to   = null_value();
    rg_i_dup_nonscalar_value(KT_CHAR_PTR, &from, &to);
    EXPECT_EQ(to.ptr_char, from.ptr_char) << "nothing is duplicated, the name notwithstanding";
}

TEST(the_two_names_of_a_file, share_a_buffer_and_differ_in_one_byte)
{
    lone_table table(number_columns());
    table->p_file_path      = strdup("dir/t.rewrite");
    table->file_path_length = 5;
    EXPECT_STREQ(rg_i_set_data_path(table.get()), "dir/t");
    EXPECT_STREQ(rg_i_set_rewrite_path(table.get()), "dir/t.rewrite");
}

TEST(a_record, is_contained_in_a_block_if_its_end_falls_into_the_block_of_its_start)
{
    lone_table  table(number_columns());
    kt_uint32_t block = 99;
    table->block_size = 512;
    EXPECT_EQ(rg_i_record_contained_in_block(table.get(), 512, 511, &block), 1);
    EXPECT_EQ(block, 1u);
    EXPECT_EQ(rg_i_record_contained_in_block(table.get(), 512, 512, &block), 0);
    EXPECT_EQ(rg_i_record_contained_in_block(table.get(), 0xFFFFFFF0u, 0x20, &block), 0);
    EXPECT_EQ(block, 0xFFFFFFF0u / 512);
    table->block_size = 0;
    EXPECT_EQ(rg_i_record_contained_in_block(table.get(), 1000, 1000, &block), 1) << "no blocks, no bounds";
    EXPECT_EQ(block, 0u);
}
