// SPDX-License-Identifier: MIT
// Setting fields: the six calls, what is kept and what goes back to its default, growth, keys, and what is refused.
#include <functional>

#include "support/rows.h"

namespace kt_test
{

namespace
{

enum class row_by { packed_index, fixed_index, key };

struct set_call {
    const char * p_name;
    row_by       by;
    bool         several;
    std::function<kt_int32_t(rg_opaque_handle_t, kt_uint32_t row, kt_char_ptr_t *, kt_value_t **, kt_uint32_t count)>
        run;
};

// Rows of these tests have keys that are their packed and fixed indices plus 1000.
kt_value_t key_of(kt_uint32_t row)
{
    return uint32(row + 1000);
}

std::vector<set_call> all_set_calls()
{
    const auto i = [](kt_uint32_t row) { return static_cast<kt_int32_t>(row); };
    return {
        {"field_by_index", row_by::packed_index, false,
         [=](auto t, auto row, auto n, auto v, auto) { return rg_set_field_by_index_1(t, i(row), n[0], v[0]); }},
        {"field_by_fixed_index", row_by::fixed_index, false,
         [=](auto t, auto row, auto n, auto v, auto) { return rg_set_field_by_fixed_index_1(t, i(row), n[0], v[0]); }},
        {"field_by_key", row_by::key, false,
         [=](auto t, auto row, auto n, auto v, auto) { return rg_set_field_by_key_1(t, key_of(row), n[0], v[0]); }},
        {"fields_by_index", row_by::packed_index, true,
         [=](auto t, auto row, auto n, auto v, auto count) {
             return rg_set_fields_by_index_1(t, i(row), n, v, count);
         }},
        {"fields_by_fixed_index", row_by::fixed_index, true,
         [=](auto t, auto row, auto n, auto v, auto count) {
             return rg_set_fields_by_fixed_index_1(t, i(row), n, v, count);
         }},
        {"fields_by_key", row_by::key, true,
         [=](auto t, auto row, auto n, auto v, auto count) {
             return rg_set_fields_by_key_1(t, key_of(row), n, v, count);
         }},
    };
}

kt_int32_t set(const set_call & call, rg_opaque_handle_t table, kt_uint32_t row, const std::string & column_name,
               kt_value_t value)
{
    kt_char_ptr_t name    = text(column_name);
    kt_value_t *  p_value = &value;
    return call.run(table, row, &name, &p_value, 1);
}

constexpr rg_row_state_t committed = RG_ROW_STATE_COMMITTED;
constexpr rg_row_state_t added     = RG_ROW_STATE_ADDED;
constexpr rg_row_state_t updated   = RG_ROW_STATE_UPDATED;

struct setting_fields : on_each_kind_of_table {
    rg_opaque_handle_t make_numbered(kt_uint32_t rows, kt_int32_t mode = explicit_writing)
    {
        const rg_opaque_handle_t table =
            make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("n", KT_INT32), column("s", KT_CHAR_PTR)}, mode);
        for (kt_uint32_t row = 0; row < rows; ++row)
            EXPECT_EQ(add_row(table, {{"id", key_of(row)},
                                      {"n", int32(static_cast<std::int32_t>(row))},
                                      {"s", string("text " + std::to_string(row))}}),
                      0);
        return table;
    }
};
ON_EACH_KIND_OF_TABLE(setting_fields);

TEST_P(setting_fields, works_through_each_call_and_keeps_the_other_columns)
{
    const rg_opaque_handle_t table = make_numbered(6);
    ASSERT_EQ(commit(table), 0);
    kt_uint32_t row = 0;
    for (const set_call & call : all_set_calls()) {
        ASSERT_EQ(set(call, table, row, "s", string("new")), 0) << call.p_name;
        EXPECT_EQ(error_code(), 0);
        EXPECT_EQ(state_of(table, row), updated);
        EXPECT_EQ(taken_string(read_fixed(table, row, "s", 1)), "new") << call.p_name;
        EXPECT_EQ(taken_string(read_fixed(table, row, "s")), "text " + std::to_string(row)) << "until the commit";
        EXPECT_EQ(read_fixed(table, row, "n", 1).value.val_uint32, row);
        EXPECT_EQ(read_fixed(table, row, "id", 1).value.val_uint32, 1000 + row);
        ++row;
    }
    EXPECT_EQ(picture_of(table).updated, (std::vector<kt_uint32_t>{0, 1, 2, 3, 4, 5}));
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 3, "s")), "new");
    EXPECT_EQ(state_of(table, 3), committed);
}

TEST_P(setting_fields, is_taken_back_by_an_abort)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"s", string("new")}, {"n", int32(5)}}), 0);
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(taken_string(read_fixed(table, 1, "s", 1)), "text 1");
}

TEST_P(setting_fields, twice_in_a_transaction_builds_on_the_first_and_gives_its_record_back)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"s", string("first")}}), 0);
    const kt_uint32_t taken = picture_of(table).taken_bytes;
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"n", int32(9)}}), 0);
    const table_picture picture = picture_of(table);
    EXPECT_EQ(picture.updated, (std::vector<kt_uint32_t>{0}));
    EXPECT_EQ(picture.taken_bytes, taken) << "the record of the first update is back in the pool";
    EXPECT_EQ(taken_string(read_fixed(table, 0, "s", 1)), "first");
    EXPECT_EQ(read_fixed(table, 0, "n", 1).value.val_int32, 9);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "s")), "first");
}

TEST_P(setting_fields, of_an_added_row_keeps_it_added_and_findable)
{
    const rg_opaque_handle_t table = make({column("name", KT_CHAR_PTR, RG_PRIMARY_KEY), column("n", KT_INT32)});
    ASSERT_EQ(add_row(table, {{"name", string("key")}, {"n", int32(1)}}), 0);
    const kt_uint32_t taken = picture_of(table).taken_bytes;
    ASSERT_EQ(set_fields_by_key(table, string("key"), {{"n", int32(2)}}), 0);
    EXPECT_EQ(state_of(table, 0), added);
    EXPECT_EQ(picture_of(table).taken_bytes, taken);
    // What was the record is used again by another row: the element no longer points there.
    ASSERT_EQ(add_row(table, {{"name", string("yek")}, {"n", int32(7)}}), 0);
    EXPECT_EQ(find_key(table, string("key")), 0);
    EXPECT_EQ(read_key(table, string("key"), "n", 1).value.val_int32, 2);
    if (GetParam().hashed) {
        EXPECT_TRUE(slot_of(table, 0).p_hash_table_element->p_key_value ==
                    rg_i_row_key(&object_of(table), slot_of(table, 0).p_applied));
    }
    EXPECT_EQ(rg_i_load_u32(slot_of(table, 0).p_applied), 0u) << "there is no record that it replaces";
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_key(table, string("key"), "n").value.val_int32, 2);
}

TEST_P(setting_fields, of_a_committed_row_replaces_its_record_in_the_file)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"n", int32(5)}}), 0);
    EXPECT_EQ(rg_i_load_u32(slot_of(table, 1).p_applied), slot_of(table, 1).file_offset);
    EXPECT_EQ(slot_of(table, 1).file_offset != 0, GetParam().persistent);
    if (GetParam().hashed) {
        EXPECT_TRUE(slot_of(table, 1).p_hash_table_element->p_key_value ==
                    rg_i_row_key(&object_of(table), slot_of(table, 1).p_committed))
            << "until commit";
    }
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, key_of(1)), 1);
}

TEST_P(setting_fields, puts_flagged_columns_back_to_their_default_unless_they_are_named)
{
    constexpr rg_qualifier_t flagged = RG_STANDARD | RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED;
    const rg_opaque_handle_t table   = make(
          {column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_INT32, flagged, int32(-1)),
           column("b", KT_CHAR_PTR, flagged, string("default b")), column("c", KT_CHAR_PTR, RG_STANDARD, string("c")),
           column("d", KT_CHAR_PTR, flagged, string("default d"))});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)},
                              {"a", int32(5)},
                              {"b", string("own b")},
                              {"c", string("own c")},
                              {"d", string("own d")}}),
              0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"d", string("new d")}}), 0);
    EXPECT_EQ(read_fixed(table, 0, "a", 1).value.val_int32, -1);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "b", 1)), "default b");
    EXPECT_EQ(taken_string(read_fixed(table, 0, "c", 1)), "own c");
    EXPECT_EQ(taken_string(read_fixed(table, 0, "d", 1)), "new d");
    EXPECT_EQ(read_fixed(table, 0, "id", 1).value.val_uint32, 1u);
}

TEST_P(setting_fields, of_nothing_is_a_change_that_resets_flagged_columns)
{
    const rg_opaque_handle_t table = make(
        {column("id", KT_UINT32, RG_PRIMARY_KEY),
         column("a", KT_INT32, RG_STANDARD | RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED, int32(-1)), column("s", KT_CHAR_PTR)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"a", int32(5)}, {"s", string("text")}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_set_fields_by_key_1(table, uint32(1), nullptr, nullptr, 0), 0);
    EXPECT_EQ(picture_of(table).updated, (std::vector<kt_uint32_t>{0}));
    EXPECT_EQ(state_of(table, 0), updated);
    EXPECT_EQ(read_fixed(table, 0, "a", 1).value.val_int32, -1);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "s", 1)), "text");
    EXPECT_EQ(rg_i_record_data_length(slot_of(table, 0).p_applied),
              rg_i_record_data_length(slot_of(table, 0).p_committed));
}

TEST_P(setting_fields, stores_the_empty_value_for_a_null_pointer)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"s", null_value()}}), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "s", 1)), "");
}

TEST_P(setting_fields, grows_the_record_past_its_double_with_the_other_columns_intact)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR), column("b", KT_CHAR_PTR),
              column("c", KT_CHAR_PTR), column("d", KT_CHAR_PTR)});
    const std::string c(50'000, 'c');
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"a", string("aaa")}, {"b", string("b")}, {"d", string("ddd")}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"c", string(c)}}), 0);
    const std::string b(700'000, 'b');
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"b", string(b)}}), 0);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "a", 1)), "aaa");
    EXPECT_EQ(taken_string(read_fixed(table, 0, "b", 1)), b);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "c", 1)), c);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "d", 1)), "ddd");
    EXPECT_TRUE(free_room_is_zero(table));
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"b", string("")}, {"c", string("")}}), 0) << "and shrinks again";
    EXPECT_EQ(rg_i_record_data_length(slot_of(table, 0).p_applied), 44u + 4 + 1 + 1 + 4);
    EXPECT_EQ(taken_string(read_fixed(table, 0, "d", 1)), "ddd");
    ASSERT_EQ(commit(table), 0);
}

TEST_P(setting_fields, packs_the_indirect_data_in_column_order)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR), column("b", KT_CHAR_PTR)});
    ASSERT_EQ(add_row(table, {{"id", uint64(1)}, {"a", string("long ago")}, {"b", string("bb")}}), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"a", string("a")}}), 0);
    const kt_char_ptr_t p_record = slot_of(table, 0).p_applied;
    const bytes         expected = from_hex("00 00 00 00"
                                                    "01 00 00 00 00 00 00 00"
                                                    "00 00 00 00 02 00 00 00"
                                                    "02 00 00 00 03 00 00 00"
                                                    "61 00"
                                                    "62 62 00");
    ASSERT_EQ(rg_i_record_data_length(p_record), expected.size());
    EXPECT_EQ(to_hex(bytes(p_record, p_record + expected.size())), to_hex(expected));
}

TEST_P(setting_fields, asks_for_room_of_twice_the_old_length)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"s", string(std::string(600'000, 'x'))}}), 0);
    const kt_uint32_t total_bytes = object_of(table).record_buffer_pool.total_bytes;
    const kt_uint32_t length      = rg_i_record_data_length(slot_of(table, 0).p_applied);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"n", int32(1)}}), 0);
    const kt_uint32_t grown = object_of(table).record_buffer_pool.total_bytes - total_bytes;
    EXPECT_TRUE(grown == 0 || grown == 2 * length + 32) << grown; // room that was there, or a block just for it
}

TEST_P(setting_fields, of_a_protected_column_is_refused_even_if_another_is_valid)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY | RG_PROTECTED),
              column("a", KT_INT32, RG_STANDARD | RG_PROTECTED, int32(4)), column("b", KT_INT32)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"b", int32(2)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"b", int32(3)}, {"a", int32(3)}}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(error_code(), RG_E_INVALID_COLUMN);
    EXPECT_EQ(error_message_index(), 12);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(3)}}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"b", int32(3)}}), 0);
    EXPECT_EQ(read_fixed(table, 0, "a", 1).value.val_int32, 4);
}

TEST_P(setting_fields, refuses_unknown_and_repeated_names_with_another_code_than_adding)
{
    const rg_opaque_handle_t table  = make_numbered(1);
    const table_picture      before = picture_of(table);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"nothing", int32(3)}}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"N", int32(3)}}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"n", int32(3)}, {"n", int32(3)}}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(add_row(table, {{"id", uint32(5)}, {"nothing", int32(3)}}), RG_E_NO_COLUMNS);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
}

TEST_P(setting_fields, refuses_rows_that_are_not_there)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    const table_picture before = picture_of(table);
    for (const set_call & call : all_set_calls()) {
        EXPECT_EQ(set(call, table, 1, "n", int32(0)), RG_E_ROW_DELETED) << call.p_name;
        EXPECT_EQ(error_message_index(), 21);
        EXPECT_EQ(set(call, table, 1, "nothing", int32(0)), RG_E_ROW_DELETED) << "ahead of the name";
        const kt_int32_t missing = set(call, table, 50, "n", int32(0));
        EXPECT_EQ(missing, call.by == row_by::packed_index  ? RG_E_NO_SUCH_INDEX
                           : call.by == row_by::fixed_index ? RG_E_ROW_DELETED
                                                            : RG_E_NO_SUCH_KEY)
            << call.p_name;
        if (call.by != row_by::key) {
            EXPECT_EQ(set(call, table, 0xFFFFFFFF, "n", int32(0)), RG_E_NO_SUCH_INDEX) << call.p_name;
            EXPECT_EQ(set(call, table, 100, "n", int32(0)), RG_E_NO_SUCH_INDEX) << call.p_name;
        }
    }
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(setting_fields, refuses_null_arguments)
{
    const rg_opaque_handle_t table  = make_numbered(1);
    const table_picture      before = picture_of(table);
    for (const set_call & call : all_set_calls()) {
        kt_value_t    value   = int32(5);
        kt_value_t *  p_value = &value;
        kt_value_t *  p_none  = nullptr;
        kt_char_ptr_t name    = text("n");
        kt_char_ptr_t no_name = nullptr;
        EXPECT_EQ(call.run(nullptr, 0, &name, &p_value, 1), RG_E_INVALID_HANDLE) << call.p_name;
        EXPECT_EQ(call.run(table, 0, &no_name, &p_value, 1), RG_E_NULL_POINTER) << call.p_name;
        EXPECT_EQ(call.run(table, 0, &name, &p_none, 1), RG_E_NULL_POINTER) << call.p_name;
        EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
        if (call.several) {
            EXPECT_EQ(call.run(table, 0, nullptr, &p_value, 1), RG_E_NULL_POINTER) << call.p_name;
            EXPECT_EQ(call.run(table, 0, &name, nullptr, 1), RG_E_NULL_POINTER) << call.p_name;
        }
    }
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(setting_fields, is_refused_between_apply_and_commit)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    const table_picture before = picture_of(table);
    for (const set_call & call : all_set_calls()) {
        EXPECT_EQ(set(call, table, 0, "n", int32(0)), RG_E_APPLIED_UNCOMMITTED) << call.p_name;
        EXPECT_EQ(error_message_index(), 29);
    }
    EXPECT_EQ(set(all_set_calls()[1], table, 0xFFFFFFFF, "n", int32(0)), RG_E_APPLIED_UNCOMMITTED)
        << "ahead of the index";
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(setting_fields, that_cannot_be_stored_is_refused)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("s", KT_CHAR_PTR), column("data", KT_SBS_PTR)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    const table_picture before = picture_of(table);
    kt_sbs_t            broken{};
    broken.length = -1;
    kt_value_t value{};
    value.ptr_sbs = &broken;
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"s", string("abc")}, {"data", value}}), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("kt_pmsg_build_conv_protocol_value"), std::string::npos);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
}

TEST_P(setting_fields, on_an_implicitly_controlled_table_is_committed)
{
    const rg_opaque_handle_t table = make_numbered(1, implicit_writing);
    for (const set_call & call : all_set_calls()) {
        ASSERT_EQ(set(call, table, 0, "s", string(call.p_name)), 0);
        EXPECT_EQ(state_of(table, 0), committed);
        EXPECT_EQ(taken_string(read_fixed(table, 0, "s")), call.p_name);
    }
}

TEST_P(setting_fields, leaves_the_index_and_the_counters_alone)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"n", int32(8)}}), 0);
    const table_picture after = picture_of(table);
    EXPECT_EQ(after.packed_index, before.packed_index);
    EXPECT_EQ(after.hashed, before.hashed);
    EXPECT_EQ(after.applied_rows, before.applied_rows);
    EXPECT_EQ(after.committed_rows, before.committed_rows);
    EXPECT_EQ(after.applied_deletions, before.applied_deletions);
}

// ---- The key ----

TEST_P(setting_fields, of_the_key_is_not_checked_for_a_duplicate)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"id", key_of(0)}}), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(read_fixed(table, 0, "id").value.val_uint32, 1000u);
    EXPECT_EQ(read_fixed(table, 1, "id").value.val_uint32, 1000u);
    EXPECT_EQ(find_key(table, key_of(0)), 0);
}

TEST_P(setting_fields, of_the_key_is_found_by_the_committed_one_until_commit)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(77)}}), 0);
    EXPECT_EQ(find_key(table, key_of(0)), 0);
    EXPECT_EQ(find_key(table, uint32(77)), -RG_E_NO_SUCH_KEY);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, key_of(0)), -RG_E_NO_SUCH_KEY);
    if (!GetParam().hashed) {
        EXPECT_EQ(find_key(table, uint32(77)), 0);
    }
}

kt_uint32_t always_one_bucket(void *)
{
    return 1;
}

struct a_key_that_is_set_on_a_hashed_table : ::testing::Test, registry_of_tables {
};

TEST_F(a_key_that_is_set_on_a_hashed_table, stays_in_the_bucket_of_its_old_key)
{
    const rg_opaque_handle_t table = make({true, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    kt_uint32_t key = 1;
    ASSERT_EQ(slot_of(table, 0).hash_index, hash_uint32(&key));
    kt_uint32_t other = 2;
    ASSERT_NE(hash_uint32(&other), hash_uint32(&key));
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(2)}}), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(slot_of(table, 0).hash_index, hash_uint32(&key));
    EXPECT_EQ(find_key(table, uint32(2)), -RG_E_NO_SUCH_KEY) << "its bucket is another one";
    EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), 0) << "so a second row of that key is not noticed";
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(commit(table), 0) << "and its element is still taken out where it stands";
    EXPECT_EQ(find_key(table, uint32(2)), 1);
}

TEST_F(a_key_that_is_set_on_a_hashed_table, is_found_where_both_keys_share_a_bucket)
{
    std::vector<rg_column_t> columns{column("id", KT_UINT32, RG_PRIMARY_KEY)};
    rg_opaque_handle_t       table = nullptr;
    ASSERT_EQ(rg_create_hashed_key_table_1(tree, text("/t"), columns.data(), 1, explicit_writing, 2, always_one_bucket,
                                           compare_uint32, &table),
              0);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(2)}}), 0);
    EXPECT_EQ(find_key(table, uint32(2)), 0) << "an added row's element follows its record at once";
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(3)}}), 0);
    EXPECT_EQ(find_key(table, uint32(3)), -RG_E_NO_SUCH_KEY);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, uint32(3)), 0);
}

// ---- Every data type through every state ----

struct values_for_type {
    kt_data_type_t type;
    kt_value_t     first;
    kt_value_t     second;
};

// Two different values of each of the 21 types; they live as long as the program.
std::vector<values_for_type> values_for_all_types()
{
    static kt_binary_t          binary{2, {7}};
    static kt_resource_handle_t handle{1, {2, 3, 4, 5}};
    static kt_structured_data_t sd{1, 0, {{KT_CHAR_PTR, 0, {}}}};
    static kt_sbs_t             sbs{4, {0, 2, 3, {0}}};
    static kt_array_t           numbers{1, 0, {{}}};
    static kt_array_t           strings{1, 0, {{}}};
    static kt_array_t           binaries{1, 0, {{}}};
    static kt_array_t           handles{1, 0, {{}}};
    static kt_array_t           structures{1, 0, {{}}};
    sd.elements[0].value                = string("inner");
    numbers.elements[0]                 = int32(5);
    strings.elements[0]                 = string("element");
    binaries.elements[0].ptr_binary     = &binary;
    handles.elements[0].ptr_rsrc_handle = &handle;
    structures.elements[0].ptr_sd       = &sd;
    const auto pointer                  = [](auto * p) {
        kt_value_t value{};
        std::memcpy(&value, &p, sizeof value);
        return value;
    };
    std::vector<values_for_type> all{{KT_INT32, int32(1), int32(-1)},        {KT_UINT32, uint32(1), uint32(2)},
                                     {KT_INT64, int64(1), int64(-1)},        {KT_UINT64, uint64(1), uint64(2)},
                                     {KT_FLOAT32, float32(1), float32(2)},   {KT_FLOAT64, float64(1), float64(2)},
                                     {KT_CHAR_PTR, string("a"), string("b")}};
    all.push_back({KT_BINARY_PTR, null_value(), pointer(&binary)});
    all.push_back({KT_RSRC_HANDLE_PTR, null_value(), pointer(&handle)});
    all.push_back({KT_SD_PTR, null_value(), pointer(&sd)});
    all.push_back({KT_SBS_PTR, null_value(), pointer(&sbs)});
    for (kt_data_type_t type = KT_INT32_ARRAY; type <= static_cast<kt_data_type_t>(KT_FLOAT64_ARRAY); ++type)
        all.push_back({type, null_value(), pointer(&numbers)});
    all.push_back({KT_CHAR_PTR_ARRAY, null_value(), pointer(&strings)});
    all.push_back({KT_BINARY_PTR_ARRAY, null_value(), pointer(&binaries)});
    all.push_back({KT_RSRC_HANDLE_PTR_ARRAY, null_value(), pointer(&handles)});
    all.push_back({KT_SD_PTR_ARRAY, null_value(), pointer(&structures)});
    return all;
}

struct the_states_of_a_row : on_each_kind_of_table {
    // The stored bytes of column "v", with its indirect item.
    static bytes stored(rg_opaque_handle_t table, kt_char_ptr_t p_record)
    {
        const kt_char_ptr_t p_slot = rg_i_row_slot(p_record, 1);
        bytes               result(p_slot, p_slot + 8);
        if (rg_i_type_is_indirect(object_of(table).p_columns[1].type)) {
            kt_pmsg_value_anchor_t anchor;
            std::memcpy(&anchor, p_slot, sizeof anchor);
            const kt_char_ptr_t p_item = rg_i_row_indirect_data(p_record, 2) + anchor.offset;
            result.assign(p_item, p_item + anchor.length);
        }
        return result;
    }
};
ON_EACH_KIND_OF_TABLE(the_states_of_a_row);

TEST_P(the_states_of_a_row, change_as_told_for_every_data_type)
{
    rg_sd_def_t definition{1, {{KT_CHAR_PTR, text("field")}}};
    for (const values_for_type & values : values_for_all_types()) {
        SCOPED_TRACE(values.type);
        rg_column_t v = column("v", values.type, RG_STANDARD, null_value());
        v.sd_defn     = &definition;
        const rg_opaque_handle_t table =
            registry_of_tables::make(GetParam(), {column("id", KT_UINT32, RG_PRIMARY_KEY), v}, explicit_writing,
                                     "type_" + std::to_string(values.type));
        const auto state   = [&] { return static_cast<int>(state_of(table, 0)); };
        const auto set_v   = [&](kt_value_t value) { return set_fields_by_fixed_index(table, 0, {{"v", value}}); };
        const auto applied = [&] { return stored(table, slot_of(table, 0).p_applied); };

        // No row, added, set while added, deleted while added, revived or added anew.
        ASSERT_EQ(state(), RG_ROW_STATE_NO_ROW);
        ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", values.first}}), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_ADDED);
        const bytes first = applied();
        ASSERT_EQ(set_v(values.second), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_ADDED);
        const bytes second = applied();
        ASSERT_NE(first, second);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_NO_ROW);
        ASSERT_EQ(set_v(values.first), RG_E_ROW_DELETED);
        ASSERT_EQ(rg_abort_1(table), 0);
        ASSERT_EQ(object_of(table).total_applied_rows, 0u);

        // Committed, set, set again, taken back, set and committed.
        ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"v", values.first}}), 0);
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_COMMITTED);
        ASSERT_EQ(applied(), first);
        ASSERT_EQ(set_v(values.second), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_UPDATED);
        ASSERT_EQ(set_v(values.first), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_UPDATED);
        ASSERT_EQ(rg_abort_1(table), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_COMMITTED);
        ASSERT_EQ(applied(), first);
        ASSERT_EQ(set_v(values.second), 0);
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(applied(), second);

        // Deleted from each state, taken back, deleted for good.
        ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_DELETED);
        ASSERT_EQ(rg_abort_1(table), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_COMMITTED);
        ASSERT_EQ(applied(), second);
        ASSERT_EQ(set_v(values.first), 0);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        ASSERT_EQ(state(), RG_ROW_STATE_DELETED);
        ASSERT_EQ(rg_abort_1(table), 0);
        ASSERT_EQ(applied(), second);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(object_of(table).total_applied_rows, 0u);
        ASSERT_EQ(state(), RG_ROW_STATE_NO_ROW);
        ASSERT_EQ(find_key(table, uint32(1)), -RG_E_NO_SUCH_KEY);
        picture_of(table);
    }
}

} // namespace

} // namespace kt_test
