// SPDX-License-Identifier: MIT
// The hash table from key to fixed row index.
#include "rg_i_hash_table.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "kt_ku.h"
#include "support/faults.h"
#include "support/registry.h"

using kt_test::call;
using kt_test::error_code;
using kt_test::error_message_index;
using kt_test::fail_call;
using kt_test::fault_scope;

namespace
{

kt_uint32_t wanted_bucket = 0; // what hash_as_wanted answers
int         comparisons   = 0;

kt_uint32_t hash_as_wanted(void *)
{
    return wanted_bucket;
}

kt_uint32_t first_byte(void * p_key)
{
    return static_cast<unsigned char *>(p_key)[0] % 8;
}

kt_int32_t compare_counted(void * p_key1, void * p_key2)
{
    ++comparisons;
    return std::strcmp(static_cast<char *>(p_key1), static_cast<char *>(p_key2));
}

kt_int32_t never_equal(void *, void *)
{
    return 1;
}

kt_char_ptr_t key(const std::string & s)
{
    return kt_test::text(s);
}

kt_char_ptr_t key(kt_resource_handle_t & handle)
{
    return reinterpret_cast<kt_char_ptr_t>(&handle);
}

class test_table
{
  public:
    test_table(kt_uint32_t buckets, rg_hash_function_t * p_hash, rg_hash_keys_compare_function_t * p_compare)
    {
        EXPECT_EQ(rg_i_hash_table_open(buckets, p_hash, p_compare, &p_table), 0);
        ku_set_no_error_1();
    }
    ~test_table() { EXPECT_EQ(rg_i_hash_table_close(p_table), 0); }
    test_table(const test_table &)             = delete;
    test_table & operator=(const test_table &) = delete;

    kt_int32_t add(kt_char_ptr_t p_key, kt_uint32_t row, rg_qualifier_t qualifier = RG_PRIMARY_KEY)
    {
        return rg_i_hash_table_add(p_table, p_key, row, &hash_index, &p_element, qualifier);
    }
    // The row, or the negative code.
    std::int64_t get(kt_char_ptr_t p_key)
    {
        kt_uint32_t      row = 0;
        const kt_int32_t rc  = rg_i_hash_table_get_index(p_table, p_key, &row, &p_p_key);
        return rc == 0 ? std::int64_t{row} : -std::int64_t{rc};
    }
    std::vector<kt_uint32_t> rows_in_bucket(kt_uint32_t bucket)
    {
        std::vector<kt_uint32_t> rows;
        for (auto * p = p_table->p_elements[bucket]; p != nullptr; p = p->p_next)
            rows.push_back(p->row_index);
        return rows;
    }

    rg_hash_table_t *         p_table    = nullptr;
    kt_uint32_t               hash_index = 77;
    rg_hash_table_element_t * p_element  = nullptr;
    kt_char_ptr_t *           p_p_key    = nullptr;
};

using rows = std::vector<kt_uint32_t>;

} // namespace

// ---- Opening and closing ----

TEST(opening_hash_tables, without_arguments_gives_16384_buckets_for_resource_handles)
{
    test_table t(0, nullptr, nullptr);
    EXPECT_EQ(t.p_table->total_hash_buckets, 16384u);
    EXPECT_EQ(t.p_table->p_hash_function, nullptr);
    EXPECT_EQ(t.p_table->p_compare_function, &ku_rsrc_hndl_cmp_1);
    EXPECT_EQ(t.rows_in_bucket(0), rows{});
    EXPECT_EQ(t.rows_in_bucket(16383), rows{});
}

TEST(opening_hash_tables, without_a_hash_function_ignores_the_comparison_and_the_number)
{
    test_table t(5, nullptr, never_equal);
    EXPECT_EQ(t.p_table->total_hash_buckets, 16384u);
    EXPECT_EQ(t.p_table->p_compare_function, &ku_rsrc_hndl_cmp_1);
}

TEST(opening_hash_tables, with_functions_keeps_them_and_the_number)
{
    test_table t(8, first_byte, compare_counted);
    EXPECT_EQ(t.p_table->total_hash_buckets, 8u);
    EXPECT_EQ(t.p_table->p_hash_function, &first_byte);
    EXPECT_EQ(t.p_table->p_compare_function, &compare_counted);
}

TEST(opening_hash_tables, without_memory_gives_12_and_leaks_nothing)
{
    fault_scope faults;
    for (unsigned nth = 1; nth <= 3; ++nth) {
        rg_hash_table_t * p_table = nullptr;
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(rg_i_hash_table_open(8, first_byte, compare_counted, &p_table), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(error_message_index(), 3);
        EXPECT_EQ(p_table, nullptr);
    }
}

TEST(closing_hash_tables, null_is_accepted)
{
    EXPECT_EQ(rg_i_hash_table_close(nullptr), 0);
}

// ---- The built-in rule ----

TEST(the_built_in_hash, takes_the_low_14_bits_of_id4)
{
    test_table           t(0, nullptr, nullptr);
    kt_resource_handle_t handle{0x11111111, {0x22222222, 0x33333333, 0x44444444, 0xFFFFC001}};
    EXPECT_EQ(rg_i_hash_table_bucket(t.p_table, key(handle)), 1u);
    handle.id.id4 = 0x00003FFF;
    EXPECT_EQ(rg_i_hash_table_bucket(t.p_table, key(handle)), 16383u);
    handle.id.id4 = 0x00004000;
    EXPECT_EQ(rg_i_hash_table_bucket(t.p_table, key(handle)), 0u);
}

TEST(the_built_in_hash, keys_that_differ_elsewhere_share_a_bucket_and_are_told_apart)
{
    test_table                        t(0, nullptr, nullptr);
    std::vector<kt_resource_handle_t> handles(6, kt_resource_handle_t{1, {2, 3, 4, 5}});
    handles[1].header += 1;
    handles[2].id.id1 += 1;
    handles[3].id.id2 += 1;
    handles[4].id.id3 += 1;
    handles[5].id.id4 += 16384;
    for (kt_uint32_t i = 0; i < handles.size(); ++i)
        ASSERT_EQ(t.add(key(handles[i]), i), 0);
    EXPECT_EQ(t.rows_in_bucket(5), (rows{5, 4, 3, 2, 1, 0}));
    for (kt_uint32_t i = 0; i < handles.size(); ++i) {
        kt_resource_handle_t wanted = handles[i];
        EXPECT_EQ(t.get(key(wanted)), i);
    }
}

TEST(the_built_in_hash, reads_a_key_at_any_address)
{
    test_table           t(0, nullptr, nullptr);
    kt_resource_handle_t handle{1, {2, 3, 4, 9}};
    alignas(8) char      storage[sizeof handle + 1];
    std::memcpy(storage + 1, &handle, sizeof handle);
    EXPECT_EQ(rg_i_hash_table_bucket(t.p_table, storage + 1), 9u);
}

// ---- Adding and finding ----

TEST(adding_keys, gives_the_bucket_and_the_element_and_a_lookup_finds_it)
{
    test_table          t(8, first_byte, compare_counted);
    const kt_char_ptr_t p_key = key("b-one");
    ASSERT_EQ(t.add(p_key, 42), 0);
    EXPECT_EQ(t.hash_index, static_cast<kt_uint32_t>('b' % 8));
    ASSERT_NE(t.p_element, nullptr);
    EXPECT_EQ(t.p_element->row_index, 42u);
    EXPECT_EQ(t.p_element->p_key_value, p_key) << "the key isn't copied";
    EXPECT_EQ(t.get(key("b-one")), 42);
    EXPECT_EQ(t.p_p_key, &t.p_element->p_key_value) << "the address of the field, through which it can be moved";
}

TEST(adding_keys, a_duplicate_gives_108_with_the_existing_element_and_no_error_record)
{
    test_table t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1), 0);
    ASSERT_EQ(t.add(key("i"), 2), 0); // same bucket
    const auto * const p_newest = t.p_element;
    t.hash_index                = 77;
    EXPECT_EQ(t.add(key("a"), 3), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(t.p_element->row_index, 1u);
    EXPECT_NE(t.p_element, p_newest);
    EXPECT_EQ(t.hash_index, 77u) << "isn't written";
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{2, 1})) << "the bucket is as it was";
}

TEST(adding_keys, modifiers_of_the_qualifier_do_not_switch_the_check_off)
{
    test_table t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1, RG_PRIMARY_KEY | RG_PROTECTED), 0);
    for (const rg_qualifier_t modifier : {RG_PROTECTED, RG_INVISIBLE, RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED})
        EXPECT_EQ(t.add(key("a"), 2, RG_PRIMARY_KEY | modifier), RG_E_DUPLICATE_KEY);
}

TEST(adding_keys, nocheck_lets_equal_keys_in_without_comparing_and_the_newer_one_is_found)
{
    test_table t(8, first_byte, compare_counted);
    comparisons = 0;
    ASSERT_EQ(t.add(key("a"), 1, RG_PRIMARY_KEY_NOCHECK), 0);
    ASSERT_EQ(t.add(key("a"), 2, RG_PRIMARY_KEY_NOCHECK | RG_INVISIBLE), 0);
    EXPECT_EQ(comparisons, 0);
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{2, 1}));
    EXPECT_EQ(t.get(key("a")), 2);
    ASSERT_EQ(rg_i_hash_table_remove_element(t.p_table, t.hash_index, t.p_element), 0);
    EXPECT_EQ(t.get(key("a")), 1) << "removed by identity, the older one comes to light";
}

TEST(adding_keys, any_other_qualifier_is_not_checked_either)
{
    test_table t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1, RG_STANDARD), 0);
    EXPECT_EQ(t.add(key("a"), 2, RG_STANDARD), 0);
    EXPECT_EQ(t.add(key("a"), 3, RG_UNKNOWN_QUALIFIER), 0);
    EXPECT_EQ(t.get(key("a")), 3);
}

TEST(adding_keys, without_memory_gives_12_and_changes_nothing)
{
    fault_scope faults;
    test_table  t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1), 0);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(t.add(key("i"), 2), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{1}));
}

TEST(adding_keys, the_first_of_a_bucket_needs_no_memory_also_when_the_bucket_has_become_empty_again)
{
    fault_scope faults;
    test_table  t(8, first_byte, compare_counted);
    fail_call(call::allocation, 1, ENOMEM, kt_test::for_good);
    for (int round = 0; round < 3; ++round) {
        ASSERT_EQ(t.add(key("a"), 1), 0);
        ASSERT_EQ(t.add(key("b"), 2), 0);
        EXPECT_EQ(t.get(key("a")), 1);
        ASSERT_EQ(rg_i_hash_table_remove(t.p_table, key("a")), 0);
        EXPECT_EQ(t.get(key("a")), -RG_E_NO_SUCH_KEY);
        ASSERT_EQ(rg_i_hash_table_remove(t.p_table, key("b")), 0);
    }
}

TEST(adding_keys, in_any_order_of_adding_and_removing_leaves_newest_first)
{
    test_table                                                     t(1, hash_as_wanted, compare_counted);
    std::vector<std::pair<kt_uint32_t, rg_hash_table_element_t *>> expected; // newest first
    unsigned                                                       state = 1;
    wanted_bucket                                                        = 0;
    for (kt_uint32_t row = 0; row < 2000; ++row) {
        state = state * 1664525u + 1013904223u;
        if (expected.empty() || state >> 30 < 2) {
            ASSERT_EQ(t.add(key("k"), row, RG_PRIMARY_KEY_NOCHECK), 0);
            expected.insert(expected.begin(), {row, t.p_element});
        } else {
            const auto it = expected.begin() + static_cast<std::ptrdiff_t>((state >> 8) % expected.size());
            ASSERT_EQ(rg_i_hash_table_remove_element(t.p_table, 0, it->second), 0);
            expected.erase(it);
        }
        rows left;
        for (const auto & [kept, p_element] : expected) {
            left.push_back(kept);
            ASSERT_EQ(p_element->row_index, kept);
        }
        ASSERT_EQ(t.rows_in_bucket(0), left);
    }
}

TEST(adding_keys, memory_is_asked_for_ahead_of_the_search_for_a_duplicate)
{
    fault_scope faults;
    test_table  t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1), 0);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(t.add(key("a"), 2), RG_E_NO_MEMORY);
}

TEST(finding_keys, a_missing_key_gives_202_and_no_error_record)
{
    test_table t(8, first_byte, compare_counted);
    EXPECT_EQ(t.get(key("a")), -RG_E_NO_SUCH_KEY);
    ASSERT_EQ(t.add(key("a"), 1), 0);
    EXPECT_EQ(t.get(key("i")), -RG_E_NO_SUCH_KEY);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(t.p_p_key, nullptr);
}

TEST(finding_keys, for_a_caller_who_goes_on_to_the_row_ends_the_same)
{
    test_table    t(8, first_byte, compare_counted);
    std::uint64_t rows_[4]{};
    kt_uint32_t   row = 77;
    ASSERT_EQ(t.add(key("a"), 1), 0);
    ASSERT_EQ(t.add(key("i"), 3), 0); // same bucket
    EXPECT_EQ(rg_i_hash_table_get_index_and_fetch(t.p_table, key("a"), &row, rows_, sizeof rows_[0]), 0);
    EXPECT_EQ(row, 1u);
    EXPECT_EQ(rg_i_hash_table_get_index_and_fetch(t.p_table, key("q"), &row, rows_, sizeof rows_[0]), RG_E_NO_SUCH_KEY);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(row, 1u);

    test_table wrong(8, hash_as_wanted, compare_counted);
    wanted_bucket = 8;
    EXPECT_EQ(rg_i_hash_table_get_index_and_fetch(wrong.p_table, key("a"), &row, rows_, sizeof rows_[0]),
              RG_E_INTERNAL);
    EXPECT_NE(kt_test::error_text().find("rg_i_hash_table_get_index"), std::string::npos);
}

// ---- Keys whose records go ahead of their rows ----

TEST(keys_of_their_own, take_the_place_of_the_former_element_wherever_it_stands)
{
    for (const std::size_t chosen : {0u, 1u, 2u}) {
        test_table                             t(8, first_byte, compare_counted);
        std::vector<std::string>               texts{"a1", "a2", "a3"};
        std::vector<rg_hash_table_element_t *> elements;
        for (std::size_t i = 0; i < 3; ++i) {
            ASSERT_EQ(t.add(texts[i].data(), static_cast<kt_uint32_t>(i)), 0);
            elements.push_back(t.p_element);
        }
        rg_hash_table_element_t * p_element = elements[chosen];
        ASSERT_EQ(rg_i_hash_table_own_key(t.p_table, 'a' % 8, 3, &p_element), 0);
        const std::string text = texts[chosen];
        texts[chosen].assign("??"); // the record goes
        EXPECT_STREQ(p_element->p_key_value, text.c_str());
        EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{2, 1, 0}));
        EXPECT_EQ(t.get(key(text)), static_cast<std::int64_t>(chosen));
        ASSERT_EQ(rg_i_hash_table_remove_element(t.p_table, 'a' % 8, p_element), 0);
        EXPECT_EQ(t.rows_in_bucket('a' % 8).size(), 2u);
    }
}

// ---- Removing ----

TEST(removing_keys, by_key_takes_the_first_equal_one)
{
    test_table t(8, first_byte, compare_counted);
    for (kt_uint32_t row = 1; row <= 3; ++row)
        ASSERT_EQ(t.add(key(row == 2 ? "i" : "a"), row, RG_PRIMARY_KEY_NOCHECK), 0);
    EXPECT_EQ(rg_i_hash_table_remove(t.p_table, key("a")), 0);
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{2, 1}));
    EXPECT_EQ(rg_i_hash_table_remove(t.p_table, key("a")), 0);
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{2}));
}

TEST(removing_keys, by_identity_from_the_head_the_middle_and_the_end)
{
    for (const kt_uint32_t removed : {1u, 2u, 3u}) {
        test_table                             t(8, first_byte, compare_counted);
        std::vector<rg_hash_table_element_t *> elements{nullptr};
        for (kt_uint32_t row = 1; row <= 3; ++row) {
            ASSERT_EQ(t.add(key("a"), row, RG_PRIMARY_KEY_NOCHECK), 0);
            elements.push_back(t.p_element);
        }
        ASSERT_EQ(rg_i_hash_table_remove_element(t.p_table, t.hash_index, elements[removed]), 0);
        rows left{3, 2, 1};
        std::erase(left, removed);
        EXPECT_EQ(t.rows_in_bucket(t.hash_index), left);
    }
}

TEST(removing_keys, what_is_not_there_gives_202_with_message_19)
{
    test_table t(8, first_byte, compare_counted);
    ASSERT_EQ(t.add(key("a"), 1), 0);
    const auto expect_report = [](kt_int32_t rc) {
        EXPECT_EQ(rc, RG_E_NO_SUCH_KEY);
        EXPECT_EQ(error_code(), RG_E_NO_SUCH_KEY);
        EXPECT_EQ(error_message_index(), 19);
        ku_set_no_error_1();
    };
    rg_hash_table_element_t stranger{1, key("a"), nullptr};
    expect_report(rg_i_hash_table_remove_element(t.p_table, 'a' % 8, &stranger));
    expect_report(rg_i_hash_table_remove_element(t.p_table, 'b' % 8, t.p_element)); // an empty bucket
    expect_report(rg_i_hash_table_remove(t.p_table, key("i")));
    expect_report(rg_i_hash_table_remove(t.p_table, key("b")));
    EXPECT_EQ(t.rows_in_bucket('a' % 8), (rows{1}));
}

// ---- Buckets out of range ----

TEST(buckets_out_of_range, give_15_and_change_nothing)
{
    for (const kt_uint32_t bucket : {8u, UINT32_MAX}) {
        test_table t(8, hash_as_wanted, compare_counted);
        wanted_bucket = 7;
        ASSERT_EQ(t.add(key("a"), 1), 0);
        auto * const p_kept = t.p_element;
        const auto   expect = [](std::int64_t rc) {
            EXPECT_EQ(rc, RG_E_INTERNAL);
            EXPECT_EQ(error_code(), RG_E_INTERNAL);
            EXPECT_EQ(error_message_index(), 6);
            ku_set_no_error_1();
        };
        wanted_bucket = bucket;
        t.hash_index  = 77;
        EXPECT_EQ(rg_i_hash_table_bucket(t.p_table, key("a")), bucket);
        expect(t.add(key("b"), 2));
        expect(-t.get(key("a")));
        expect(rg_i_hash_table_remove(t.p_table, key("a")));
        expect(rg_i_hash_table_remove_element(t.p_table, bucket, p_kept));
        EXPECT_EQ(t.hash_index, 77u);
        EXPECT_EQ(t.p_element, p_kept);
        EXPECT_EQ(t.rows_in_bucket(7), (rows{1}));
    }
}

TEST(buckets_out_of_range, a_table_without_buckets_refuses_every_key)
{
    wanted_bucket = 0;
    test_table t(0, hash_as_wanted, compare_counted);
    EXPECT_EQ(t.add(key("a"), 1), RG_E_INTERNAL);
    EXPECT_EQ(t.get(key("a")), -RG_E_INTERNAL);
}

// ---- Statistics ----

TEST(hash_table_statistics, show_the_used_buckets_in_order_and_three_totals)
{
    test_table t(8, first_byte, compare_counted);
    for (const char * p : {"c", "a", "i", "q"})
        ASSERT_EQ(t.add(key(p), 1), 0);
    testing::internal::CaptureStdout();
    rg_i_hash_table_output_stats(t.p_table);
    std::fflush(stdout);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "1 3\n3 1\n"
                                                      "total hash buckets : 8\n"
                                                      "max_bucket_count   : 3\n"
                                                      "unused buckets     : 6\n");
}
