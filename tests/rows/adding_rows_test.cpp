// SPDX-License-Identifier: MIT
// Adding rows: what a row holds, what is refused and with which code, keys, slots and the pending state.
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <limits>

#include "support/rows.h"

namespace kt_test
{

namespace
{

struct adding_rows : on_each_kind_of_table {
    rg_opaque_handle_t make_simple(kt_int32_t mode = explicit_writing)
    {
        return make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("none")),
                     column("size", KT_INT64, RG_STANDARD, int64(-7))},
                    mode);
    }
};
ON_EACH_KIND_OF_TABLE(adding_rows);

TEST_P(adding_rows, a_row_without_its_key_is_refused_even_if_every_other_column_is_named)
{
    const rg_opaque_handle_t table  = make_simple();
    const table_picture      before = picture_of(table);
    EXPECT_EQ(add_row(table, {{"name", string("a")}, {"size", int64(1)}}), RG_E_KEY_EXPECTED);
    EXPECT_EQ(error_code(), RG_E_KEY_EXPECTED);
    EXPECT_EQ(error_message_index(), 14);
    EXPECT_EQ(add_row(table, {}), RG_E_KEY_EXPECTED);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
}

TEST_P(adding_rows, the_key_alone_gives_a_row_of_defaults)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(5)}}), 0);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "name", 1)), "none");
    EXPECT_EQ(read_fixed(table, 0, "size", 1).value.val_int64, -7);
    EXPECT_EQ(read_fixed(table, 0, "id", 1).value.val_uint32, 5u);
}

TEST_P(adding_rows, an_added_row_is_pending_and_has_its_state)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(5)}}), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    const table_picture picture = picture_of(table);
    EXPECT_EQ(picture.updated, (std::vector<kt_uint32_t>{0, 1}));
    EXPECT_EQ(picture.packed_index, (std::vector<kt_uint32_t>{0, 1}));
    EXPECT_EQ(picture.applied_rows, 2u);
    EXPECT_EQ(picture.committed_rows, 0u);
    EXPECT_EQ(state_of(table, 1), static_cast<rg_row_state_t>(RG_ROW_STATE_ADDED));
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(state_of(table, 1), static_cast<rg_row_state_t>(RG_ROW_STATE_COMMITTED));
    EXPECT_EQ(picture_of(table).committed_rows, 2u);
}

TEST_P(adding_rows, an_abort_takes_added_rows_back)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(find_key(table, uint32(2)), -RG_E_NO_SUCH_KEY);
}

TEST_P(adding_rows, a_name_given_twice_is_refused_although_the_row_would_be_complete)
{
    const rg_opaque_handle_t table  = make_simple();
    const table_picture      before = picture_of(table);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"size", int64(1)}, {"name", string("a")}, {"size", int64(2)}}),
              RG_E_NO_COLUMNS);
    EXPECT_EQ(error_message_index(), 11);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"id", uint32(1)}}), RG_E_NO_COLUMNS);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
}

TEST_P(adding_rows, names_are_matched_exactly)
{
    const rg_opaque_handle_t table  = make_simple();
    const table_picture      before = picture_of(table);
    for (const char * p_name : {"Size", "siz", "sizes", "", "size "})
        EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {p_name, int64(1)}}), RG_E_NO_COLUMNS) << p_name;
    EXPECT_EQ(add_row(table, {{"ID", uint32(1)}}), RG_E_KEY_EXPECTED);
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(adding_rows, the_missing_key_is_told_ahead_of_an_unknown_name)
{
    const rg_opaque_handle_t table = make_simple();
    EXPECT_EQ(add_row(table, {{"nothing", int64(1)}}), RG_E_KEY_EXPECTED);
}

TEST_P(adding_rows, an_unknown_name_is_told_ahead_of_a_duplicate_key)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"nothing", int64(1)}}), RG_E_NO_COLUMNS);
}

TEST_P(adding_rows, columns_may_be_named_in_any_order)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"size", int64(4)}, {"id", uint32(1)}, {"name", string("x")}}), 0);
    EXPECT_EQ(read_fixed(table, 0, "size", 1).value.val_int64, 4);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "name", 1)), "x");
}

TEST_P(adding_rows, null_pointers_among_the_arguments_are_refused)
{
    const rg_opaque_handle_t table  = make_simple();
    const table_picture      before = picture_of(table);
    kt_char_ptr_t            names[]{text("id"), nullptr};
    kt_value_t               value = uint32(1);
    kt_value_t *             values[]{&value, nullptr};
    kt_char_ptr_t            good_names[]{text("id"), text("size")};
    EXPECT_EQ(rg_add_row_1(table, nullptr, values, 1), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_add_row_1(table, names, nullptr, 1), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_add_row_1(table, names, values, 2), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_add_row_1(table, good_names, values, 2), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_add_row_1(table, nullptr, nullptr, 0), RG_E_KEY_EXPECTED) << "arrays of nothing are not looked at";
    EXPECT_EQ(rg_add_row_1(nullptr, names, values, 1), RG_E_INVALID_HANDLE);
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(adding_rows, a_table_with_applied_updates_takes_no_row)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    const table_picture before = picture_of(table);
    EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(error_message_index(), 29);
    EXPECT_EQ(rg_add_row_1(table, nullptr, nullptr, 3), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(picture_of(table), before);
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
}

TEST_P(adding_rows, an_implicitly_controlled_table_commits_each_row)
{
    const rg_opaque_handle_t table = make_simple(implicit_writing);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(state_of(table, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_COMMITTED));
    EXPECT_EQ(picture_of(table).updated.size(), 0u);
    EXPECT_EQ(object_of(table).change_counter, 2u);
}

TEST_P(adding_rows, a_refused_row_on_an_implicitly_controlled_table_commits_nothing)
{
    const rg_opaque_handle_t table = make_simple(implicit_writing);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(object_of(table).change_counter, 2u);
    EXPECT_EQ(picture_of(table).applied_rows, 1u);
}

TEST_P(adding_rows, an_equal_key_is_refused_and_its_slot_is_free_again)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"name", string("first")}}), 0);
    const table_picture pending = picture_of(table);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"name", string("second")}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_message_index(), 15);
    EXPECT_EQ(picture_of(table), pending);
    ASSERT_EQ(commit(table), 0);
    const table_picture committed = picture_of(table);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(picture_of(table), committed);
    EXPECT_TRUE(free_room_is_zero(table));
    ASSERT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
    EXPECT_EQ(find_key(table, uint32(2)), 1);
}

TEST_P(adding_rows, the_modifier_bits_of_the_key_leave_the_check_on)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY | RG_PROTECTED | RG_INVISIBLE)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_DUPLICATE_KEY);
}

TEST_P(adding_rows, without_the_check_rows_of_one_key_coexist)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("n", KT_INT32)});
    for (int n = 0; n < 3; ++n)
        ASSERT_EQ(add_row(table, {{"id", uint32(9)}, {"n", int32(n)}}), 0);
    EXPECT_EQ(picture_of(table).applied_rows, 3u);
    // A hash table finds the newest, which stands first in its bucket; a scan finds the first.
    EXPECT_EQ(read_key(table, uint32(9), "n", 1).value.val_int32, GetParam().hashed ? 2 : 0);
}

TEST_P(adding_rows, a_null_string_stores_the_empty_string)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"name", null_value()}}), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "name", 1)), "");
}

TEST_P(adding_rows, a_null_string_as_key_is_the_empty_key)
{
    const rg_opaque_handle_t table = make({column("name", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"name", null_value()}}), 0);
    EXPECT_EQ(add_row(table, {{"name", null_value()}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(add_row(table, {{"name", string("")}}), RG_E_DUPLICATE_KEY);
    ASSERT_EQ(add_row(table, {{"name", string("a")}}), 0);
    EXPECT_EQ(find_key(table, string("")), 0);
}

TEST_P(adding_rows, the_row_holds_a_copy_of_the_values)
{
    const rg_opaque_handle_t table = make_simple();
    char                     name[]{"mine"};
    kt_value_t               value{};
    value.ptr_char = name;
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"name", value}}), 0);
    name[0] = 'X';
    EXPECT_EQ(taken_string(read_fixed(table, 0, "name", 1)), "mine");
}

TEST_P(adding_rows, long_values_grow_the_record_and_leave_the_earlier_columns_intact)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR), column("b", KT_INT32),
              column("c", KT_CHAR_PTR), column("d", KT_CHAR_PTR, RG_STANDARD, string(std::string(3000, 'd'))),
              column("e", KT_CHAR_PTR)});
    const std::string a(100, 'a');
    const std::string c(200'000, 'c');
    const std::string e(3'000'000, 'e');
    ASSERT_EQ(
        add_row(table, {{"id", uint32(1)}, {"a", string(a)}, {"b", int32(5)}, {"c", string(c)}, {"e", string(e)}}), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "a", 1)), a);
    EXPECT_EQ(read_fixed(table, 0, "b", 1).value.val_int32, 5);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "c", 1)), c);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "d", 1)), std::string(3000, 'd'));
    EXPECT_EQ(taken_string(read_fixed(table, 0, "e", 1)), e);
    EXPECT_TRUE(free_room_is_zero(table)) << "the room that was too small is given back";
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "c")), c);
}

TEST_P(adding_rows, a_default_longer_than_the_room_grows_it_as_well)
{
    const std::string        long_default(500'000, 'x');
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR, RG_STANDARD, string(long_default))});
    for (kt_uint32_t id = 0; id < 3; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 2, "a", 1)), long_default);
}

TEST_P(adding_rows, the_record_is_the_slots_and_then_the_indirect_data_in_column_order)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR, RG_STANDARD, string("def")),
              column("b", KT_INT64), column("c", KT_CHAR_PTR)});
    ASSERT_EQ(add_row(table, {{"c", string("last")}, {"b", int64(-2)}, {"id", uint64(0x1122334455667788)}}), 0);
    const kt_char_ptr_t p_record = slot_of(table, 0).p_applied;
    const bytes         expected = from_hex("00 00 00 00"             // replaces_offset: no committed record
                                            "88 77 66 55 44 33 22 11" // all eight bytes of the caller's value
                                            "00 00 00 00 04 00 00 00" // anchor of a
                                            "fe ff ff ff ff ff ff ff"
                                                    "04 00 00 00 05 00 00 00" // anchor of c
                                            "64 65 66 00"             // "def"
                                            "6c 61 73 74 00");        // "last"
    EXPECT_EQ(+rg_i_record_head(p_record)->type, static_cast<kt_uint32_t>(RG_RECORD_TYPE_ROW));
    ASSERT_EQ(rg_i_record_data_length(p_record), expected.size());
    EXPECT_EQ(to_hex(bytes(p_record, p_record + expected.size())), to_hex(expected));
}

TEST_P(adding_rows, a_value_that_cannot_be_stored_is_refused)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR), column("data", KT_SBS_PTR)});
    const table_picture before = picture_of(table);
    kt_sbs_t            broken{};
    broken.length = -1;
    kt_value_t value{};
    value.ptr_sbs = &broken;
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"name", string("abc")}, {"data", value}}), RG_E_LIBRARY_CALL);
    EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("kt_pmsg_build_conv_protocol_value"), std::string::npos);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"data", value}, {"nothing", value}}), RG_E_LIBRARY_CALL)
        << "names are counted when the record is complete";
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
}

TEST_P(adding_rows, slots_are_used_in_order_and_the_index_doubles)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK)});
    ASSERT_EQ(object_of(table).maximum_rows, 100u);
    for (kt_uint32_t id = 0; id < 100; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    EXPECT_EQ(object_of(table).maximum_rows, 100u);
    ASSERT_EQ(add_row(table, {{"id", uint32(100)}}), 0);
    EXPECT_EQ(object_of(table).maximum_rows, 200u);
    EXPECT_EQ(find_key(table, uint32(100)), 100);
    for (kt_uint32_t id = 101; id < 1000; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    for (kt_uint32_t id = 0; id < 1000; ++id)
        ASSERT_EQ(read_fixed(table, id, "id", 1).value.val_uint32, id);
    EXPECT_EQ(picture_of(table).updated.size(), 1000u);
    EXPECT_EQ(commit(table), 0);
}

TEST_P(adding_rows, a_first_guess_of_32_bytes_an_indirect_column_is_asked_of_the_pool)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"a", string("b")}}), 0);
    // 20 bytes of fixed part, 2 of string; the room for a hundred rows was there already.
    EXPECT_EQ(rg_i_record_data_length(slot_of(table, 0).p_applied), 22u);
}

TEST_P(adding_rows, in_a_forked_child_it_is_refused_without_a_record)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_DUPLICATE_KEY);
    const pid_t child = fork();
    if (child == 0) {
        const bool as_told = add_row(table, {{"id", uint32(2)}}) == RG_E_INTERNAL &&
                             error_code() == RG_E_DUPLICATE_KEY && read_fixed(table, 0, "size", 1).rc == 0;
        _exit(as_told ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST_P(adding_rows, many_refused_rows_leave_the_pool_as_it_was)
{
    const rg_opaque_handle_t table = make_simple();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    const table_picture before = picture_of(table);
    for (size_t length = 1; length < 100'000; length = length * 3 + 1) {
        EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"name", string(std::string(length, 'z'))}}), RG_E_DUPLICATE_KEY);
        EXPECT_EQ(add_row(table, {{"name", string(std::string(length, 'z'))}}), RG_E_KEY_EXPECTED);
        EXPECT_EQ(add_row(table, {{"id", uint32(2)}, {"name", string(std::string(length, 'z'))}, {"x", int32(1)}}),
                  RG_E_NO_COLUMNS);
        EXPECT_TRUE(free_room_is_zero(table));
    }
    EXPECT_EQ(picture_of(table), before);
}

struct a_table_open_for_reading : ::testing::Test, registry_of_tables {
};

TEST_F(a_table_open_for_reading, takes_no_row)
{
    ASSERT_EQ(rg_close_table_1(make({false, true}, {column("id", KT_UINT32, RG_PRIMARY_KEY)})), 0);
    const rg_opaque_handle_t table = open_table(tree, "/kept/table", RG_MODE_READ);
    ASSERT_NE(table, nullptr);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_ACCESS);
    EXPECT_EQ(error_message_index(), 23);
    EXPECT_EQ(object_of(table).total_applied_rows, 0u);
}

// ---- Keys of each type ----

struct keys_of_each_type : ::testing::Test, registry_of_tables {
    // Adds the keys, all different, and then finds each of them refused.
    void add_twice(kt_data_type_t type, const std::vector<kt_value_t> & keys)
    {
        const rg_opaque_handle_t table = make({false, false}, {column("k", type, RG_PRIMARY_KEY)}, explicit_writing,
                                              "of_type_" + std::to_string(type));
        for (size_t i = 0; i < keys.size(); ++i) {
            ASSERT_EQ(add_row(table, {{"k", keys[i]}}), 0) << type << " " << i;
            ASSERT_EQ(find_key(table, keys[i]), static_cast<std::int64_t>(i)) << type;
        }
        for (size_t i = 0; i < keys.size(); ++i)
            ASSERT_EQ(add_row(table, {{"k", keys[i]}}), RG_E_DUPLICATE_KEY) << type << " " << i;
    }
};

TEST_F(keys_of_each_type, are_told_apart_on_the_width_of_the_type)
{
    add_twice(KT_INT32, {int32(0), int32(-1), int32(INT32_MIN), int32(INT32_MAX)});
    add_twice(KT_UINT32, {uint32(0), uint32(1), uint32(UINT32_MAX)});
    add_twice(KT_INT64, {int64(0), int64(-1), int64(INT64_MIN), int64(INT64_MAX), int64(std::int64_t{1} << 32)});
    add_twice(KT_UINT64, {uint64(0), uint64(UINT64_MAX), uint64(std::uint64_t{1} << 32)});
    add_twice(KT_FLOAT32, {float32(0), float32(-1.5f), float32(std::numeric_limits<float>::infinity())});
    add_twice(KT_FLOAT64, {float64(0), float64(1e300), float64(-std::numeric_limits<double>::infinity())});
    add_twice(KT_CHAR_PTR, {string(""), string("a"), string("ab"), string("\xc3\xa4"), string(std::string(9999, 'k'))});
}

TEST_F(keys_of_each_type, of_32_bits_ignore_the_other_half_of_the_value)
{
    const rg_opaque_handle_t table = make({false, false}, {column("k", KT_INT32, RG_PRIMARY_KEY)});
    kt_value_t               value = uint64(0xAAAAAAAA00000007);
    ASSERT_EQ(add_row(table, {{"k", value}}), 0);
    EXPECT_EQ(add_row(table, {{"k", int32(7)}}), RG_E_DUPLICATE_KEY);
}

TEST_F(keys_of_each_type, that_are_nan_equal_every_key_of_a_scan)
{
    for (const kt_data_type_t type : {KT_FLOAT32, KT_FLOAT64}) {
        const rg_opaque_handle_t table =
            make({false, false}, {column("k", type, RG_PRIMARY_KEY)}, explicit_writing, "nan_" + std::to_string(type));
        const auto value = [&](double v) {
            return type == static_cast<kt_data_type_t>(KT_FLOAT32) ? float32(static_cast<float>(v)) : float64(v);
        };
        ASSERT_EQ(add_row(table, {{"k", value(1)}}), 0);
        EXPECT_EQ(add_row(table, {{"k", value(NAN)}}), RG_E_DUPLICATE_KEY) << "a NaN equals the 1";
        EXPECT_EQ(find_key(table, value(NAN)), 0);
        const rg_opaque_handle_t first_nan = make({false, false}, {column("k", type, RG_PRIMARY_KEY)}, explicit_writing,
                                                  "first_" + std::to_string(type));
        ASSERT_EQ(add_row(first_nan, {{"k", value(NAN)}}), 0) << "nothing to compare with";
        EXPECT_EQ(add_row(first_nan, {{"k", value(1)}}), RG_E_DUPLICATE_KEY) << "anything equals the NaN";
    }
}

TEST_F(keys_of_each_type, that_are_resource_handles_are_hashed_without_asking)
{
    const rg_opaque_handle_t table = make({false, true}, {column("k", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY)});
    ASSERT_NE(object_of(table).p_rows_hash_table, nullptr);
    kt_resource_handle_t one{1, {2, 3, 4, 5}};
    kt_resource_handle_t other{1, {9, 3, 4, 5 + 16384}}; // the same bucket
    kt_value_t           key{};
    key.ptr_rsrc_handle = &one;
    ASSERT_EQ(add_row(table, {{"k", key}}), 0);
    EXPECT_EQ(add_row(table, {{"k", key}}), RG_E_DUPLICATE_KEY);
    key.ptr_rsrc_handle = &other;
    ASSERT_EQ(add_row(table, {{"k", key}}), 0);
    EXPECT_EQ(find_key(table, key), 1);
    EXPECT_EQ(slot_of(table, 0).hash_index, slot_of(table, 1).hash_index);
    ASSERT_EQ(add_row(table, {{"k", null_value()}}), 0) << "the invalid handle";
    EXPECT_EQ(add_row(table, {{"k", null_value()}}), RG_E_DUPLICATE_KEY);
}

// ---- Hash functions ----

kt_uint32_t Bucket_To_Return = 0;

kt_uint32_t hash_as_asked(void *)
{
    return Bucket_To_Return;
}

struct a_hash_function : ::testing::Test, registry_of_tables {
    a_hash_function() { Bucket_To_Return = 0; }
    rg_opaque_handle_t make_with_four_buckets()
    {
        std::vector<rg_column_t> columns{column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR)};
        rg_opaque_handle_t       table = nullptr;
        EXPECT_EQ(rg_create_hashed_key_table_1(tree, text("/t"), columns.data(), 2, explicit_writing, 4, hash_as_asked,
                                               compare_uint32, &table),
                  0);
        return table;
    }
};

TEST_F(a_hash_function, that_gives_no_bucket_is_an_internal_error_and_nothing_changes)
{
    const rg_opaque_handle_t table = make_with_four_buckets();
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    const table_picture before = picture_of(table);
    for (const kt_uint32_t bucket : {4u, 5u, 0x80000000u, 0xFFFFFFFFu}) {
        Bucket_To_Return = bucket;
        EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), RG_E_INTERNAL);
        EXPECT_EQ(error_code(), RG_E_INTERNAL);
        EXPECT_EQ(find_key(table, uint32(1)), -RG_E_INTERNAL);
        EXPECT_EQ(error_code(), RG_E_INTERNAL);
    }
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
    Bucket_To_Return = 3;
    EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
}

TEST_F(a_hash_function, may_put_all_keys_into_one_bucket)
{
    const rg_opaque_handle_t table = make_with_four_buckets();
    for (kt_uint32_t id = 0; id < 50; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    for (kt_uint32_t id = 0; id < 50; ++id)
        EXPECT_EQ(find_key(table, uint32(id)), id);
    EXPECT_EQ(add_row(table, {{"id", uint32(17)}}), RG_E_DUPLICATE_KEY);
}

// ---- Holes ----

struct a_slot_that_is_reused : ::testing::Test, registry_of_tables {
    rg_opaque_handle_t make_with_hole(kt_uint32_t deleted, bool hashed = false,
                                      rg_qualifier_t qualifier = RG_PRIMARY_KEY)
    {
        const rg_opaque_handle_t table = make({hashed, false}, {column("id", KT_UINT32, qualifier)});
        for (kt_uint32_t id = 0; id < 3; ++id)
            EXPECT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
        EXPECT_EQ(commit(table), 0);
        EXPECT_EQ(rg_delete_row_by_index_1(table, deleted), 0);
        EXPECT_EQ(commit(table), 0);
        return table;
    }
};

TEST_F(a_slot_that_is_reused, below_a_live_row_makes_any_new_key_match_itself_without_a_hash_table)
{
    const rg_opaque_handle_t table  = make_with_hole(1);
    const table_picture      before = picture_of(table);
    EXPECT_EQ(add_row(table, {{"id", uint32(77)}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(picture_of(table), before);
}

TEST_F(a_slot_that_is_reused, above_all_live_rows_takes_a_new_key)
{
    const rg_opaque_handle_t table = make_with_hole(2);
    ASSERT_EQ(add_row(table, {{"id", uint32(77)}}), 0);
    EXPECT_EQ(find_key(table, uint32(77)), 2);
}

TEST_F(a_slot_that_is_reused, is_the_lowest_one_where_keys_are_hashed_or_not_checked)
{
    const rg_opaque_handle_t hashed = make_with_hole(1, true);
    ASSERT_EQ(add_row(hashed, {{"id", uint32(77)}}), 0);
    EXPECT_EQ(find_key(hashed, uint32(77)), 1);
    EXPECT_EQ(slot_of(hashed, 1).packed_index, 2u);
    ASSERT_EQ(rg_close_table_1(hashed), 0);
    ASSERT_EQ(add_row(hashed, {{"id", uint32(78)}}), 0) << "a transient table stays in the tree";
    const rg_opaque_handle_t unchecked = [&] {
        const rg_opaque_handle_t table =
            make({false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK)}, explicit_writing, "unchecked");
        for (kt_uint32_t id = 0; id < 3; ++id)
            EXPECT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
        EXPECT_EQ(commit(table), 0);
        EXPECT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        EXPECT_EQ(commit(table), 0);
        return table;
    }();
    ASSERT_EQ(add_row(unchecked, {{"id", uint32(77)}}), 0);
    EXPECT_EQ(find_key(unchecked, uint32(77)), 0);
}

TEST_F(a_slot_that_is_reused, is_not_the_one_of_a_pending_deletion)
{
    const rg_opaque_handle_t table = make({false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY)});
    for (kt_uint32_t id = 0; id < 3; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    // The scan passes the deleted row over, and the same key takes a slot of its own.
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(slot_of(table, 3).p_committed, nullptr);
    EXPECT_EQ(object_of(table).applied_deletions, 1u);
    EXPECT_EQ(object_of(table).total_applied_rows, 4u);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, uint32(1)), 3);
    EXPECT_EQ(picture_of(table).applied_rows, 3u);
}

// ---- Revival ----

struct adding_a_key_whose_deletion_is_pending : ::testing::TestWithParam<table_kind>, registry_of_tables {
    rg_opaque_handle_t make_strings()
    {
        return make(GetParam(), {column("name", KT_CHAR_PTR, RG_PRIMARY_KEY), column("n", KT_INT32)});
    }
};
INSTANTIATE_TEST_SUITE_P(tables, adding_a_key_whose_deletion_is_pending,
                         ::testing::Values(table_kind{true, false}, table_kind{true, true}), name_of_kind);

TEST_P(adding_a_key_whose_deletion_is_pending, revives_a_committed_row_in_its_place)
{
    const rg_opaque_handle_t table = make_strings();
    for (const char * p_name : {"a", "b", "c"})
        ASSERT_EQ(add_row(table, {{"name", string(p_name)}, {"n", int32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const kt_uint32_t file_offset = slot_of(table, 1).file_offset;
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(object_of(table).applied_deletions, 1u);
    const kt_char_ptr_t p_key = slot_of(table, 1).p_hash_table_element->p_key_value;
    ASSERT_EQ(add_row(table, {{"name", string("b")}, {"n", int32(2)}}), 0);
    EXPECT_EQ(object_of(table).applied_deletions, 0u);
    const table_picture picture = picture_of(table);
    EXPECT_EQ(picture.applied_rows, 3u);
    EXPECT_EQ(picture.updated, (std::vector<kt_uint32_t>{1}));
    EXPECT_TRUE(picture.deleted.empty());
    EXPECT_EQ(state_of(table, 1), static_cast<rg_row_state_t>(RG_ROW_STATE_UPDATED));
    EXPECT_EQ(slot_of(table, 1).p_hash_table_element->p_key_value, p_key) << "the element keeps its key";
    EXPECT_EQ(rg_i_load_u32(slot_of(table, 1).p_applied), file_offset);
    EXPECT_EQ(file_offset != 0, GetParam().persistent);
    EXPECT_EQ(read_key(table, string("b"), "n", 1).value.val_int32, 2);
    EXPECT_EQ(read_key(table, string("b"), "n").value.val_int32, 1);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_key(table, string("b"), "n").value.val_int32, 2);
    EXPECT_EQ(find_key(table, string("b")), 1);
}

TEST_P(adding_a_key_whose_deletion_is_pending, brings_the_old_row_back_on_abort)
{
    const rg_opaque_handle_t table = make_strings();
    ASSERT_EQ(add_row(table, {{"name", string("a")}, {"n", int32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(add_row(table, {{"name", string("a")}, {"n", int32(2)}}), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(read_key(table, string("a"), "n").value.val_int32, 1);
}

TEST_P(adding_a_key_whose_deletion_is_pending, revives_a_row_that_was_never_committed_whatever_became_of_its_record)
{
    const rg_opaque_handle_t table = make_strings();
    ASSERT_EQ(add_row(table, {{"name", string("key")}, {"n", int32(1)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(state_of(table, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_NO_ROW));
    // The record's place is used again, by other bytes.
    ASSERT_EQ(add_row(table, {{"name", string("yek")}, {"n", int32(7)}}), 0);
    EXPECT_EQ(find_key(table, string("yek")), 1) << "another key doesn't revive";
    EXPECT_EQ(find_key(table, string("key")), 0);
    EXPECT_EQ(read_key(table, string("key"), "n").rc, RG_E_ROW_DELETED);
    EXPECT_EQ(read_key(table, string("key"), "n", 1).rc, RG_E_ROW_DELETED);
    ASSERT_EQ(add_row(table, {{"name", string("key")}, {"n", int32(2)}}), 0);
    EXPECT_EQ(find_key(table, string("key")), 0) << "the slot is revived";
    EXPECT_EQ(state_of(table, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_ADDED));
    EXPECT_EQ(object_of(table).applied_deletions, 0u);
    EXPECT_EQ(add_row(table, {{"name", string("key")}}), RG_E_DUPLICATE_KEY);
    const table_picture picture = picture_of(table);
    EXPECT_EQ(picture.applied_rows, 2u);
    EXPECT_EQ(picture.updated, (std::vector<kt_uint32_t>{1, 0})) << "moved behind the row that was added meanwhile";
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_key(table, string("key"), "n").value.val_int32, 2);
    EXPECT_EQ(read_key(table, string("yek"), "n").value.val_int32, 7);
}

TEST_P(adding_a_key_whose_deletion_is_pending, can_go_back_and_forth)
{
    const rg_opaque_handle_t table = make_strings();
    for (int n = 0; n < 5; ++n) {
        ASSERT_EQ(add_row(table, {{"name", string("key")}, {"n", int32(n)}}), 0);
        ASSERT_EQ(set_fields_by_key(table, string("key"), {{"n", int32(100 + n)}}), 0);
        EXPECT_EQ(read_key(table, string("key"), "n", 1).value.val_int32, 100 + n);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        EXPECT_EQ(read_key(table, string("key"), "n", 1).rc, RG_E_ROW_DELETED);
    }
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, string("key")), -RG_E_NO_SUCH_KEY);
    EXPECT_EQ(picture_of(table).applied_rows, 0u);
    EXPECT_TRUE(picture_of(table).hashed.empty());
}

TEST_P(adding_a_key_whose_deletion_is_pending, leaves_no_trace_of_a_row_that_is_deleted_again_after_an_abort)
{
    const rg_opaque_handle_t table  = make_strings();
    const table_picture      before = picture_of(table);
    ASSERT_EQ(add_row(table, {{"name", string("key")}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(picture_of(table), before);
}

} // namespace

} // namespace kt_test
