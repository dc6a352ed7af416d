// SPDX-License-Identifier: MIT
// A rebuild refuses rows with equal keys, as adding them one by one does, also where an index of
// keys takes the place of walks.
#include <cmath>
#include <limits>

#include "schema/columns_kit.h"
#include "support/faults.h"

namespace kt_test
{

namespace
{

constexpr kt_uint32_t many = 200; // rows: enough for an index of keys

struct a_rebuild_of_many_rows : testing::Test, registry_of_tables {
    // A table without a hash table, with a row for each key. No key is checked on the way.
    rg_opaque_handle_t of_keys(kt_data_type_t type, const std::vector<kt_value_t> & keys)
    {
        const rg_opaque_handle_t table =
            make({false, true}, {column("k", type, RG_PRIMARY_KEY_NOCHECK), column("n", KT_UINT32)}, explicit_writing,
                 "t" + std::to_string(++number_of_tables));
        for (kt_uint32_t n = 0; n < keys.size(); ++n)
            EXPECT_EQ(add_row(table, {{"k", keys[n]}, {"n", uint32(n)}}), 0);
        EXPECT_EQ(commit(table), 0);
        object_of(table).p_columns[0].qualifier = RG_PRIMARY_KEY;
        return table;
    }
    static void expect_rebuilt(rg_opaque_handle_t table)
    {
        ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0) << error_text();
        EXPECT_EQ(object_of(table).p_columns[0].qualifier, rg_qualifier_t{RG_PRIMARY_KEY})
            << "and the key is checked again";
        for (kt_uint32_t slot = 0; slot < object_of(table).total_applied_rows; ++slot)
            EXPECT_EQ(read_fixed(table, slot, "n").value.val_uint32, slot);
    }
    static void expect_refused(rg_opaque_handle_t table)
    {
        const table_picture before = picture_of(table);
        expect_failure_without_record(RG_E_DUPLICATE_KEY, add_columns(table, {column("extra", KT_INT32)}));
        EXPECT_EQ(picture_of(table), before);
    }

    int number_of_tables = 0;
};

template <class Make> std::vector<kt_value_t> keys(Make make)
{
    std::vector<kt_value_t> result;
    for (kt_uint32_t i = 0; i < many; ++i)
        result.push_back(make(i));
    return result;
}

} // namespace

TEST_F(a_rebuild_of_many_rows, goes_through_if_all_keys_differ_whatever_their_type)
{
    expect_rebuilt(of_keys(KT_INT32, keys([](kt_uint32_t i) { return int32(static_cast<std::int32_t>(i) - 100); })));
    expect_rebuilt(of_keys(KT_UINT32, keys([](kt_uint32_t i) { return uint32(many - i); })));
    expect_rebuilt(of_keys(KT_INT64, keys([](kt_uint32_t i) { return int64(std::int64_t{i} << 40); })));
    expect_rebuilt(of_keys(KT_UINT64, keys([](kt_uint32_t i) { return uint64(~std::uint64_t{i}); })));
    expect_rebuilt(of_keys(KT_FLOAT32, keys([](kt_uint32_t i) { return float32(static_cast<float>(i) / 3); })));
    expect_rebuilt(of_keys(KT_FLOAT64, keys([](kt_uint32_t i) { return float64(1.0 + i * 0x1p-50); })));
    expect_rebuilt(of_keys(KT_CHAR_PTR, keys([](kt_uint32_t i) { return string("key " + std::to_string(i)); })));
}

TEST_F(a_rebuild_of_many_rows, is_refused_if_two_keys_are_equal)
{
    const auto with_twins = [](std::vector<kt_value_t> values, kt_value_t first, kt_value_t last) {
        values.front() = first;
        values.back()  = last;
        return values;
    };
    // The unused half of a 32-bit value doesn't count.
    kt_value_t seven = uint64(0xAAAAAAAA00000007), other_seven = uint64(0x5555555500000007);
    expect_refused(
        of_keys(KT_UINT32, with_twins(keys([](kt_uint32_t i) { return uint32(i + 10); }), seven, other_seven)));
    expect_refused(
        of_keys(KT_INT32, with_twins(keys([](kt_uint32_t i) { return uint32(i + 10); }), seven, other_seven)));
    expect_refused(
        of_keys(KT_INT64, with_twins(keys([](kt_uint32_t i) { return int64(i + 10); }), int64(-1), int64(-1))));
    expect_refused(
        of_keys(KT_UINT64, with_twins(keys([](kt_uint32_t i) { return uint64(i + 10); }), uint64(1), uint64(1))));
    const auto text_key = [](kt_uint32_t i) { return string("key " + std::to_string(i)); };
    expect_refused(of_keys(KT_CHAR_PTR, with_twins(keys(text_key), string(""), null_value())));
    expect_refused(of_keys(KT_CHAR_PTR, with_twins(keys(text_key), string("twin"), string("twin"))));
}

TEST_F(a_rebuild_of_many_rows, takes_the_two_zeros_for_equal_and_a_nan_for_equal_to_everything)
{
    auto floats = keys([](kt_uint32_t i) { return float32(static_cast<float>(i) + 1); });
    floats[5]   = float32(0.0f);
    expect_rebuilt(of_keys(KT_FLOAT32, floats));
    floats[90] = float32(-0.0f);
    expect_refused(of_keys(KT_FLOAT32, floats));
    auto doubles = keys([](kt_uint32_t i) { return float64(i + 1.0); });
    doubles[5]   = float64(-0.0);
    doubles[90]  = float64(std::numeric_limits<double>::infinity());
    expect_rebuilt(of_keys(KT_FLOAT64, doubles));
    doubles[90] = float64(std::numeric_limits<double>::quiet_NaN());
    expect_refused(of_keys(KT_FLOAT64, doubles));
}

// A string is compared with stored ones as the client has it, so that equal ones in another code set aren't found.
TEST_F(a_rebuild_of_many_rows, compares_strings_of_another_code_set_as_adding_does)
{
    auto & object = *static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    ASSERT_EQ(ku_iconv_close_1(object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_close_1(object.p_from_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_TO_TABLE, &object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_FROM_TABLE, &object.p_from_table_string_conversion_handle), 0);
    auto values = keys([](kt_uint32_t i) { return string("key " + std::to_string(i)); });
    values[3]   = string("\xe4");
    values[150] = string("\xe4");
    expect_rebuilt(of_keys(KT_CHAR_PTR, values));
    values[3] = string("\xc3\xa4"); // stored in four bytes; as the client has it, it is what the other one is stored as
    values[150] = string("\xe4");
    std::swap(values[3], values[150]);
    expect_refused(of_keys(KT_CHAR_PTR, values));
}

TEST_F(a_rebuild_of_many_rows, refuses_an_equal_key_afterwards)
{
    const rg_opaque_handle_t table = of_keys(KT_UINT32, keys([](kt_uint32_t i) { return uint32(i); }));
    expect_rebuilt(table);
    EXPECT_EQ(add_row(table, {{"k", uint32(5)}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(add_row(table, {{"k", uint32(many)}}), 0);
}

TEST_F(a_rebuild_of_many_rows, without_memory_for_the_keys_has_each_row_checked_by_itself)
{
    unsigned went_through = 0;
    for (unsigned nth = 1;; ++nth) {
        const rg_opaque_handle_t table  = of_keys(KT_UINT32, keys([](kt_uint32_t i) { return uint32(i); }));
        bool                     failed = false;
        kt_int32_t               rc     = 0;
        {
            const fault_scope faults;
            fail_call(call::allocation, nth, ENOMEM);
            rc     = add_columns(table, {column("extra", KT_INT32)});
            failed = failed_as_asked(call::allocation);
        }
        EXPECT_TRUE(rc == 0 || rc == RG_E_NO_MEMORY) << rc;
        EXPECT_EQ(object_of(table).total_columns, rc == 0 ? 3u : 2u);
        if (!failed)
            break;
        went_through += rc == 0 ? 1 : 0;
        ASSERT_EQ(rg_close_table_1(table), 0);
        if (nth > 2000) {
            ADD_FAILURE() << "the rebuild never succeeds";
            break;
        }
    }
    EXPECT_GT(went_through, 0u);
}

} // namespace kt_test
