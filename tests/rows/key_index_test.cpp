// SPDX-License-Identifier: MIT
// Tables without a hash table: what their index of keys answers is what walking over the keys finds.
#include "table/rg_i_key_index.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <thread>
#include <vector>

#include "support/faults.h"
#include "support/registry.h"
#include "support/rows.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicit_mode = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// Has the next walk make an index, or sees to it that none is made.
void want_index(rg_opaque_handle_t table)
{
    object_of(table).key_walk_rows = UINT64_MAX / 2;
}
void refuse_index(rg_opaque_handle_t table)
{
    rg_i_key_index_drop(&object_of(table));
}

bool has_index(rg_opaque_handle_t table)
{
    return object_of(table).p_key_index != nullptr;
}

rg_opaque_handle_t make_numbers(const open_tree & tree, const std::string & path, rg_qualifier_t qualifier,
                                kt_uint32_t rows)
{
    const rg_opaque_handle_t table = create_table(
        tree, path, {column("id", KT_UINT32, qualifier), column("n", KT_INT64, RG_STANDARD, int64(0))}, explicit_mode);
    for (kt_uint32_t id = 0; id < rows; ++id)
        EXPECT_EQ(add_row(table, {{"id", uint32(id)}, {"n", int64(id)}}), 0);
    return table;
}

// ---- Two tables with one life, one of which has no index ----

struct key_case {
    const char *   p_name;
    kt_data_type_t type;
    rg_qualifier_t qualifier;
};

void PrintTo(const key_case & c, std::ostream * p_stream)
{
    *p_stream << c.p_name;
}

class key_index : public testing::TestWithParam<key_case>
{
  protected:
    key_index()
    {
        const std::vector<rg_column_t> columns{column("id", GetParam().type, GetParam().qualifier),
                                               column("n", KT_INT64, RG_STANDARD, int64(0))};
        indexed_ = create_table(tree_, "/indexed", columns, explicit_mode);
        walked_  = create_table(tree_, "/walked", columns, explicit_mode);
    }

    unsigned random()
    {
        state_ = state_ * 6364136223846793005ull + 1442695040888963407ull;
        return static_cast<unsigned>(state_ >> 33);
    }

    // From so few keys that most are met again; among them those that compare oddly.
    kt_value_t some_key(unsigned keys)
    {
        const unsigned n = random() % keys;
        switch (GetParam().type) {
        case KT_INT32:
            return int32(static_cast<std::int32_t>(n) - 50);
        case KT_UINT32:
            return uint32(n);
        case KT_INT64:
            return int64(static_cast<std::int64_t>(n) * -0x100000001ll);
        case KT_UINT64:
            return uint64(std::uint64_t{n} << 33);
        case KT_FLOAT32:
            return float32(n == 1 ? -0.0f : static_cast<float>(n) * 0.25f);
        case KT_FLOAT64:
            return float64(n == 1 ? -0.0 : static_cast<double>(n) * 0.25);
        default:
            return string(n == 0 ? "" : "key-" + std::to_string(n));
        }
    }

    template <class Call> void on_both(const char * p_what, Call && call)
    {
        refuse_index(walked_);
        if (!has_index(indexed_))
            want_index(indexed_);
        const auto with    = call(indexed_);
        const auto without = call(walked_);
        ASSERT_EQ(with, without) << p_what << " in step " << step_;
    }

    void one_step(unsigned keys)
    {
        const kt_value_t key  = some_key(keys);
        const kt_value_t next = some_key(keys);
        const unsigned   kind = random() % 100;
        if (kind < 40)
            on_both("find", [&](rg_opaque_handle_t table) { return find_key(table, key); });
        else if (kind < 70)
            on_both("add", [&](rg_opaque_handle_t table) {
                return add_row(table, {{"id", key}, {"n", int64(step_)}});
            });
        else if (kind < 78)
            on_both("set another key", [&](rg_opaque_handle_t table) {
                return set_fields_by_key(table, key, {{"id", next}});
            });
        else if (kind < 83)
            on_both("set", [&](rg_opaque_handle_t table) {
                return set_fields_by_key(table, key, {{"n", int64(step_)}});
            });
        else if (kind < 95)
            on_both("delete", [&, row = static_cast<kt_int32_t>(random() % 100)](rg_opaque_handle_t table) {
                return rg_delete_row_by_index_1(table, row);
            });
        else if (kind < 98)
            on_both("commit", [&](rg_opaque_handle_t table) { return commit(table); });
        else
            on_both("abort", [&](rg_opaque_handle_t table) { return rg_abort_1(table); });
        ++step_;
    }

    open_tree          tree_;
    rg_opaque_handle_t indexed_ = nullptr;
    rg_opaque_handle_t walked_  = nullptr;
    std::uint64_t      state_   = 42;
    int                step_    = 0;
};

} // namespace

TEST_P(key_index, answers_what_a_walk_finds_in_any_life_of_a_table)
{
    int steps_with_index = 0;
    for (const unsigned keys : {60u, 400u, 100'000u})
        for (int i = 0; i < 4000 && !HasFatalFailure(); ++i) {
            one_step(keys);
            steps_with_index += has_index(indexed_) ? 1 : 0;
        }
    EXPECT_GT(steps_with_index, 6000);
}

INSTANTIATE_TEST_SUITE_P(keys, key_index,
                         testing::Values(key_case{"int32", KT_INT32, RG_PRIMARY_KEY},
                                         key_case{"uint32", KT_UINT32, RG_PRIMARY_KEY},
                                         key_case{"uint32_nocheck", KT_UINT32, RG_PRIMARY_KEY_NOCHECK},
                                         key_case{"int64", KT_INT64, RG_PRIMARY_KEY},
                                         key_case{"uint64_nocheck", KT_UINT64, RG_PRIMARY_KEY_NOCHECK},
                                         key_case{"float32", KT_FLOAT32, RG_PRIMARY_KEY},
                                         key_case{"float64", KT_FLOAT64, RG_PRIMARY_KEY},
                                         key_case{"string", KT_CHAR_PTR, RG_PRIMARY_KEY},
                                         key_case{"string_nocheck", KT_CHAR_PTR, RG_PRIMARY_KEY_NOCHECK}),
                         [](const auto & info) { return std::string(info.param.p_name); });

// ---- When there is one ----

TEST(making_key_indexes, happens_where_walks_have_become_dear)
{
    open_tree                tree;
    const rg_opaque_handle_t few = make_numbers(tree, "/few", RG_PRIMARY_KEY, 20);
    for (int i = 0; i < 1000; ++i)
        EXPECT_EQ(find_key(few, uint32(19)), 19);
    EXPECT_FALSE(has_index(few)) << "a walk over few rows is as quick";

    const rg_opaque_handle_t many = make_numbers(tree, "/many", RG_PRIMARY_KEY_NOCHECK, 1000);
    EXPECT_EQ(find_key(many, uint32(999)), 999);
    EXPECT_FALSE(has_index(many)) << "one lookup doesn't pay for it";
    for (int i = 0; i < 10; ++i)
        EXPECT_EQ(find_key(many, uint32(999)), 999);
    EXPECT_TRUE(has_index(many));

    const rg_opaque_handle_t added = make_numbers(tree, "/added", RG_PRIMARY_KEY, 200);
    EXPECT_TRUE(has_index(added)) << "each add looks for a duplicate";
}

TEST(making_key_indexes, is_given_up_without_memory_and_nothing_else_happens)
{
    fault_scope              faults;
    open_tree                tree;
    const rg_opaque_handle_t table = make_numbers(tree, "/t", RG_PRIMARY_KEY_NOCHECK, 100);
    for (unsigned nth = 1; nth <= 3; ++nth) {
        want_index(table);
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(find_key(table, uint32(99)), 99);
        EXPECT_FALSE(has_index(table));
        EXPECT_TRUE(failed_as_asked(call::allocation));
        reset_calls();
    }
    want_index(table);
    EXPECT_EQ(find_key(table, uint32(99)), 99);
    ASSERT_TRUE(has_index(table));
}

TEST(making_key_indexes, stops_and_starts_anew_where_an_index_cannot_grow)
{
    fault_scope              faults;
    open_tree                tree;
    const rg_opaque_handle_t table   = make_numbers(tree, "/t", RG_PRIMARY_KEY, 100);
    bool                     dropped = false;
    want_index(table);
    EXPECT_EQ(find_key(table, uint32(99)), 99);
    for (kt_uint32_t id = 100; id < 2000; ++id) {
        for (unsigned nth = 1; nth <= 4; ++nth) { // whichever allocation it is: all are the add's but the index's
            fail_call(call::allocation, nth, ENOMEM);
            const kt_int32_t rc = add_row(table, {{"id", uint32(id)}});
            reset_calls();
            dropped = dropped || !has_index(table);
            if (rc == 0)
                break;
            ASSERT_EQ(rc, RG_E_NO_MEMORY);
        }
        ASSERT_EQ(find_key(table, uint32(id)), id);
        ASSERT_EQ(add_row(table, {{"id", uint32(id / 2)}}), RG_E_DUPLICATE_KEY);
    }
    EXPECT_TRUE(dropped);
    EXPECT_TRUE(has_index(table));
}

TEST(making_key_indexes, does_not_happen_for_a_key_that_equals_all)
{
    open_tree                tree;
    const rg_opaque_handle_t table =
        create_table(tree, "/t", {column("id", KT_FLOAT64, RG_PRIMARY_KEY_NOCHECK)}, explicit_mode);
    const double nan = std::numeric_limits<double>::quiet_NaN();
    for (int i = 0; i < 100; ++i)
        ASSERT_EQ(add_row(table, {{"id", float64(i)}}), 0);
    want_index(table);
    EXPECT_EQ(find_key(table, float64(50)), 50);
    ASSERT_TRUE(has_index(table));
    EXPECT_EQ(find_key(table, float64(nan)), 0) << "it equals the first";
    EXPECT_EQ(find_key(table, float64(-0.0)), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_row(table, {{"id", float64(nan)}}), 0);
    EXPECT_EQ(find_key(table, float64(50)), 50);
    EXPECT_EQ(find_key(table, float64(1000)), 0) << "the stored one equals any";
}

TEST(key_indexes, see_a_new_row_in_a_hole_below_others_as_its_own_duplicate)
{
    open_tree                tree;
    const rg_opaque_handle_t table = make_numbers(tree, "/t", RG_PRIMARY_KEY, 100);
    ASSERT_EQ(commit(table), 0);
    ASSERT_TRUE(has_index(table));
    ASSERT_EQ(rg_delete_row_by_index_1(table, 50), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(5000)}}), RG_E_DUPLICATE_KEY);
    ASSERT_TRUE(has_index(table));
    // With all above it gone, the hole is the last slot.
    for (kt_uint32_t id = 51; id < 100; ++id)
        ASSERT_EQ(rg_delete_row_by_index_1(
                      table, static_cast<kt_int32_t>(object_of(table).p_rows_fixed_index[id].packed_index)),
                  0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(5000)}}), 0);
    EXPECT_EQ(find_key(table, uint32(5000)), 50);
}

TEST(key_indexes, of_many_equal_keys_leave_it_to_the_walk)
{
    open_tree                tree;
    const rg_opaque_handle_t table =
        create_table(tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK)}, explicit_mode);
    for (kt_uint32_t i = 0; i < 1000; ++i)
        ASSERT_EQ(add_row(table, {{"id", uint32(7)}}), 0);
    want_index(table);
    EXPECT_EQ(find_key(table, uint32(7)), 0);
    EXPECT_EQ(find_key(table, uint32(8)), -RG_E_NO_SUCH_KEY);
}

TEST(key_indexes, are_not_worn_out_by_a_key_that_comes_and_goes)
{
    open_tree                tree;
    const rg_opaque_handle_t table = make_numbers(tree, "/t", RG_PRIMARY_KEY, 100);
    ASSERT_EQ(commit(table), 0);
    ASSERT_TRUE(has_index(table));
    for (int round = 0; round < 200; ++round) {
        ASSERT_EQ(add_row(table, {{"id", uint32(5000)}}), 0);
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(set_fields_by_key(table, uint32(5000), {{"id", uint32(6000)}}), 0);
        ASSERT_EQ(commit(table), 0);
        kt_uint32_t slot = 0;
        EXPECT_EQ(rg_i_key_index_find(&object_of(table), uint32(6000), &slot), rg_i_key_answer::present);
        EXPECT_EQ(slot, 100u);
        EXPECT_EQ(rg_i_key_index_find(&object_of(table), uint32(5000), &slot), rg_i_key_answer::absent);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 100), 0);
        ASSERT_EQ(commit(table), 0);
        EXPECT_EQ(rg_i_key_index_find(&object_of(table), uint32(6000), &slot), rg_i_key_answer::absent);
    }
}

TEST(key_indexes, go_when_a_reader_becomes_a_writer)
{
    temp_dir  dir;
    open_tree tree;
    open_tree other;
    tree.mount("/m", dir.path());
    other.mount("/m", dir.path());
    rg_opaque_handle_t writer = make_numbers(other, "/m/t", RG_PRIMARY_KEY, 100);
    ASSERT_EQ(commit(writer), 0);
    rg_opaque_handle_t reader = nullptr;
    ASSERT_EQ(rg_open_table_1(tree, text("/m/t"), RG_MODE_READ, &reader), 0);
    want_index(reader);
    EXPECT_EQ(find_key(reader, uint32(99)), 99);
    ASSERT_TRUE(has_index(reader));
    ASSERT_EQ(add_row(writer, {{"id", uint32(100)}}), 0);
    ASSERT_EQ(commit(writer), 0);
    ASSERT_EQ(rg_close_table_1(writer), 0);

    rg_opaque_handle_t upgraded = nullptr;
    ASSERT_EQ(rg_open_table_1(tree, text("/m/t"), explicit_mode, &upgraded), 0);
    ASSERT_EQ(upgraded, reader);
    EXPECT_FALSE(has_index(reader));
    EXPECT_EQ(find_key(reader, uint32(100)), 100);
}

// ---- Several readers ----

TEST(threads_key_index, readers_may_all_be_the_one_that_makes_it)
{
    open_tree                tree;
    const rg_opaque_handle_t table = make_numbers(tree, "/t", RG_PRIMARY_KEY_NOCHECK, 2000);
    ASSERT_EQ(commit(table), 0);
    for (int round = 0; round < 5; ++round) {
        refuse_index(table);
        std::vector<std::thread> readers;
        for (kt_uint32_t reader = 0; reader < 4; ++reader)
            readers.emplace_back([=] {
                for (kt_uint32_t i = 0; i < 60; ++i) {
                    const kt_uint32_t id = 1999 - (i * 37 + reader) % 1000;
                    EXPECT_EQ(find_key(table, uint32(id)), id);
                }
            });
        for (std::thread & reader : readers)
            reader.join();
        EXPECT_TRUE(has_index(table));
    }
}
