// SPDX-License-Identifier: MIT
// packing: what a packed buffer holds, byte for byte, and which rows go into it.
#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <thread>

#include "protocol/packed_kit.h"
#include "protocol/rg_x_protocol.h"
#include "support/allocations.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicit_writing = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

std::vector<rg_column_t> id_and_text()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("text", KT_CHAR_PTR, RG_STANDARD, null_value())};
}

rg_opaque_handle_t table_of_ids(rg_opaque_handle_t tree, const std::string & path, std::uint32_t rows,
                                kt_int32_t mode = explicit_writing)
{
    const rg_opaque_handle_t table = create_table(tree, path, id_and_text(), mode);
    for (std::uint32_t id = 0; id < rows; ++id)
        EXPECT_EQ(add_row(table, {{"id", uint32(id)}, {"text", string("row " + std::to_string(id))}}), 0);
    if ((mode & RG_MODE_EXPLICIT_CONTROL) != 0) {
        EXPECT_EQ(commit(table), 0);
    }
    return table;
}

// The keys of the packed rows, in their order.
std::vector<std::uint32_t> packed_ids(const octets & buffer, size_t table = 0)
{
    std::vector<std::uint32_t> ids;
    for (size_t row = 0; row < row_count(buffer, table); ++row)
        ids.push_back(word_at(buffer, row_start(buffer, table, row) + 24));
    return ids;
}

using ids = std::vector<std::uint32_t>;

std::uint32_t told_rows(octets & buffer, size_t table = 0)
{
    return static_cast<std::uint32_t>(item_model(buffer, table, item::fixed_metadata).elements[1].number);
}

} // namespace

TEST(packing, no_tables_give_forty_bytes)
{
    void * p_buffer = nullptr;
    ASSERT_EQ(rg_pack_tables_1(0, nullptr, nullptr, nullptr, nullptr, &p_buffer), 0);
    octets buffer(static_cast<std::uint8_t *>(p_buffer), static_cast<std::uint8_t *>(p_buffer) + 40);
    std::free(p_buffer);
    EXPECT_EQ(to_hex(buffer), to_hex(buffer_of({}, machine::here)));
}

TEST(packing, a_table_of_every_type_has_the_bytes_of_the_format)
{
    open_tree         tree;
    table_maker       maker;
    const table_model table  = table_of_everything();
    octets            buffer = packed({{maker.create(tree, table)}});
    // The key was made column 0 already, each row was committed by itself, and the table counted on from 1.
    octets expected = buffer_of({packed_form(table, machine::here, {}, 3)}, machine::here);
    clear_row_words(buffer);
    EXPECT_EQ(to_hex(buffer), to_hex(expected));
}

TEST(packing, several_tables_stand_one_behind_the_other)
{
    open_tree         tree;
    table_maker       maker;
    const table_model first  = table_of_everything("first");
    const table_model second = {"second", {{"key", KT_CHAR_PTR, {}, RG_PRIMARY_KEY}}, {{a_string("x")}}};
    const table_model third  = {"third", {{"key", KT_INT64, {}, RG_PRIMARY_KEY_NOCHECK}}, {}};
    octets buffer   = packed({{maker.create(tree, first)}, {maker.create(tree, second)}, {maker.create(tree, third)}});
    octets expected = buffer_of({packed_form(first, machine::here, {}, 3), packed_form(second, machine::here, {}, 2),
                                 packed_form(third, machine::here, {}, 1)},
                                machine::here);
    clear_row_words(buffer);
    EXPECT_EQ(to_hex(buffer), to_hex(expected));
}

TEST(packing, a_table_without_rows_has_an_array_of_none)
{
    open_tree tree;
    octets    buffer = packed({{table_of_ids(tree, "none", 0)}});
    EXPECT_EQ(row_count(buffer), 0u);
    EXPECT_EQ(word_at(buffer, slot_of_item(0, item::rows) + 4), 8u) << "the head of an array";
}

TEST(packing, an_unnamed_table_has_the_empty_name_in_both_places)
{
    open_tree          tree;
    rg_opaque_handle_t table  = table_of_ids(tree, "named", 1);
    kt_char_ptr_t      p_name = std::exchange(object_of(table).p_name, nullptr);
    octets             buffer = packed({{table}});
    object_of(table).p_name   = p_name;
    EXPECT_EQ(item_model(buffer, 0, item::name).text, "");
    EXPECT_EQ(item_model(buffer, 0, item::fixed_metadata).elements[0].text, "");
}

TEST(packing, a_table_with_a_file_has_the_files_path_in_the_directory_and_its_own_in_the_metadata)
{
    registry_of_tables registry;
    rg_opaque_handle_t table  = registry.make({false, true}, id_and_text(), registry_of_tables::implicit_writing, "a");
    octets             buffer = packed({{table}});
    EXPECT_EQ(item_model(buffer, 0, item::name).text, registry.directory.path() + "/a");
    EXPECT_EQ(item_model(buffer, 0, item::fixed_metadata).elements[0].text, "/kept/a");
}

TEST(packing, strings_go_out_in_the_tables_encoding)
{
    open_tree          tree;
    rg_opaque_handle_t table = create_table(tree, "t", id_and_text(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"text", string("gr\xC3\xBC\xC3\x9F")}}), 0);
    const octets buffer = packed({{table}});
    const size_t row    = row_start(buffer, 0, 0);
    EXPECT_STREQ(reinterpret_cast<const char *>(&buffer[row + 24 + 16]), "gr\xC3\xBC\xC3\x9F");
}

// ---- Which rows ----

TEST(packing_rows, each_view_has_its_own_rows_and_versions)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 4);
    ASSERT_EQ(add_row(table, {{"id", uint32(100)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 2, {{"text", string("changed")}}), 0);

    octets committed = packed({{table, 0}});
    EXPECT_EQ(packed_ids(committed), (ids{0, 1, 2, 3}));
    EXPECT_EQ(told_rows(committed), 4u);
    EXPECT_NE(std::string(committed.begin(), committed.end()).find("row 2"), std::string::npos);

    octets applied = packed({{table, 1}});
    EXPECT_EQ(packed_ids(applied), (ids{0, 2, 3, 100}));
    EXPECT_NE(std::string(applied.begin(), applied.end()).find("changed"), std::string::npos);
    EXPECT_EQ(std::string(applied.begin(), applied.end()).find("row 2"), std::string::npos);
    EXPECT_EQ(told_rows(applied), 5u) << "a row whose deletion is pending still counts";
}

TEST(packing_rows, a_committed_view_passes_over_a_row_that_is_only_added)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 3);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(50)}}), RG_E_DUPLICATE_KEY) << "a hole below a live row is refilled so";
    rg_opaque_handle_t unchecked = create_table(
        tree, "u", {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("n", KT_INT32)}, explicit_writing);
    for (std::uint32_t id = 0; id < 3; ++id)
        ASSERT_EQ(add_row(unchecked, {{"id", uint32(id)}}), 0);
    ASSERT_EQ(commit(unchecked), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(unchecked, 0), 0);
    ASSERT_EQ(commit(unchecked), 0);
    ASSERT_EQ(add_row(unchecked, {{"id", uint32(50)}}), 0);
    ASSERT_EQ(slot_of(unchecked, 0).p_committed, nullptr) << "the added row stands below the committed ones";

    EXPECT_EQ(packed_ids(packed({{unchecked, 0}})), (ids{1, 2}));
    EXPECT_EQ(packed_ids(packed({{unchecked, 1}})), (ids{50, 1, 2}));
}

TEST(packing_rows, holes_are_passed_over)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 5);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 3), 0);
    ASSERT_EQ(commit(table), 0);
    octets buffer = packed({{table}});
    EXPECT_EQ(packed_ids(buffer), (ids{1, 2, 4})) << "in the order of the fixed index";
    EXPECT_EQ(told_rows(buffer), 3u);
}

TEST(packing_rows, what_the_tables_own_readers_see_plays_no_part)
{
    open_tree          tree;
    rg_opaque_handle_t table                     = table_of_ids(tree, "t", 1);
    object_of(table).uncommitted_updates_visible = 1;
    ASSERT_EQ(add_row(table, {{"id", uint32(9)}}), 0);
    EXPECT_EQ(packed_ids(packed({{table, 0}})), (ids{0}));
    object_of(table).uncommitted_updates_visible = 0;
    EXPECT_EQ(packed_ids(packed({{table, 1}})), (ids{0, 9}));
}

TEST(packing_rows, chosen_rows_stand_in_the_order_given_and_may_repeat)
{
    open_tree          tree;
    rg_opaque_handle_t table  = table_of_ids(tree, "t", 5);
    octets             buffer = packed({{table, 0, {4, 0, 4, 2}}});
    EXPECT_EQ(packed_ids(buffer), (ids{4, 0, 4, 2}));
}

TEST(packing_rows, the_metadata_tells_the_whole_count_though_rows_are_chosen)
{
    open_tree          tree;
    rg_opaque_handle_t table  = table_of_ids(tree, "t", 5);
    octets             buffer = packed({{table, 0, {1}}});
    EXPECT_EQ(told_rows(buffer), 5u);
    EXPECT_EQ(row_count(buffer), 1u);
}

TEST(packing_rows, the_runs_of_chosen_rows_follow_each_other_and_a_table_without_takes_none)
{
    open_tree          tree;
    rg_opaque_handle_t a      = table_of_ids(tree, "a", 5);
    rg_opaque_handle_t b      = table_of_ids(tree, "b", 3);
    rg_opaque_handle_t c      = table_of_ids(tree, "c", 5);
    octets             buffer = packed({{a, 0, {3, 1}}, {b}, {c, 0, {4}}});
    EXPECT_EQ(packed_ids(buffer, 0), (ids{3, 1}));
    EXPECT_EQ(packed_ids(buffer, 1), (ids{0, 1, 2}));
    EXPECT_EQ(packed_ids(buffer, 2), (ids{4}));
}

TEST(packing_rows, a_chosen_row_that_is_not_there_is_refused)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 3);
    ASSERT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    const kt_uint32_t slots = object_of(table).maximum_rows;

    struct {
        kt_uint32_t  index, visible;
        const char * why;
    } const refused[] = {{3, 0, "not committed yet"}, {1, 1, "its deletion is pending"},
                         {50, 0, "a free slot"},      {50, 1, "a free slot"},
                         {slots, 1, "no slot"},       {0xFFFFFFFF, 0, "no slot"}};
    for (const auto & r : refused) {
        SCOPED_TRACE(r.why);
        octets buffer;
        EXPECT_EQ(pack({{table, r.visible, {0, r.index}}}, &buffer), RG_E_ROW_DELETED);
        EXPECT_EQ(error_code(), RG_E_ROW_DELETED);
    }
    EXPECT_EQ(packed_ids(packed({{table, 1, {3}}})), (ids{3}));
    EXPECT_EQ(packed_ids(packed({{table, 0, {1}}})), (ids{1}));
}

TEST(packing_rows, a_table_may_stand_there_twice)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 2);
    ASSERT_EQ(add_row(table, {{"id", uint32(7)}}), 0);
    octets buffer = packed({{table, 0}, {table, 1}});
    EXPECT_EQ(packed_ids(buffer, 0), (ids{0, 1}));
    EXPECT_EQ(packed_ids(buffer, 1), (ids{0, 1, 7}));
    EXPECT_EQ(commit(table), 0) << "it is locked by nobody now";
}

TEST(packing_rows, nothing_in_the_table_changes)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 4);
    ASSERT_EQ(add_row(table, {{"id", uint32(7)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    const table_picture before  = picture_of(table);
    const kt_uint64_t   counter = object_of(table).change_counter;
    packed({{table, 0}, {table, 1}, {table, 1, {2}}});
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(object_of(table).change_counter, counter);
}

// The length word of a row counts itself, so a packed row reaches four bytes past its record. Here nothing follows.
TEST(packing_rows, a_row_that_ends_its_block_of_memory_is_packed_whole)
{
    open_tree          tree;
    const auto         long_text = [](size_t length) { return string(std::string(length, 'x')); };
    rg_opaque_handle_t probe     = create_table(tree, "probe", id_and_text(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(probe, {{"id", uint32(1)}, {"text", long_text(700000)}}), 0);
    const char *      p_record = slot_of(probe, 0).p_applied - RG_I_RECORD_HEAD_LENGTH;
    const kt_uint32_t length   = rg_i_load_u32(p_record);
    const kt_uint32_t left     = rg_i_load_u32(p_record + length);

    rg_opaque_handle_t table = create_table(tree, "exact", id_and_text(), RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"text", long_text(700000 + left)}}), 0);
    const char * p_exact = slot_of(table, 0).p_applied - RG_I_RECORD_HEAD_LENGTH;
    const char * p_end   = nullptr;
    for (const auto * p_block = object_of(table).record_buffer_pool.p_first_record_buffer; p_block != nullptr;
         p_block              = p_block->p_next)
        if (const char * p = reinterpret_cast<const char *>(p_block); p < p_exact && p_exact < p + p_block->total_bytes)
            p_end = p + p_block->total_bytes;
    ASSERT_EQ(p_exact + rg_i_load_u32(p_exact), p_end) << "the row is the last of its block";

    const octets buffer = packed({{table}});
    const size_t row    = row_start(buffer, 0, 0);
    EXPECT_EQ(word_at(buffer, row + word_at(buffer, row)), 0u) << "behind the last record of a block are zeros";
}

// ---- Definitions and defaults ----

namespace
{

// The types and names of the fields in a packed definition, as "type:name".
std::vector<std::string> packed_fields(const std::vector<std::pair<kt_data_type_t, std::string>> & fields,
                                       kt_int32_t *                                                p_rc = nullptr)
{
    open_tree         tree;
    table_maker       maker;
    const table_model table = {
        "t", {{"id", KT_UINT32, {}, RG_PRIMARY_KEY}, {"sd", KT_SD_PTR, {}, RG_STANDARD, 0, fields}}, {}};
    octets           buffer;
    const kt_int32_t rc = pack({{maker.create(tree, table)}}, &buffer);
    if (p_rc != nullptr)
        *p_rc = rc;
    std::vector<std::string> result;
    if (rc != 0) {
        EXPECT_EQ(error_code(), rc);
        return result;
    }
    const model sd = item_model(buffer, 0, item::column_metadata).elements[1];
    EXPECT_EQ(sd.elements.size(), 8u);
    EXPECT_EQ(sd.elements[5].number, fields.size());
    for (size_t f = 0; f < sd.elements[6].elements.size(); ++f)
        result.push_back(std::to_string(sd.elements[6].elements[f].number) + ":" + sd.elements[7].elements[f].text);
    EXPECT_EQ(sd.elements[7].elements.size(), result.size());
    return result;
}

std::uint32_t word_of(const char (&four)[5])
{
    std::uint32_t word;
    std::memcpy(&word, four, 4);
    return word;
}

using fields = std::vector<std::string>;

} // namespace

TEST(packing_definitions, the_first_field_goes_out_with_the_start_of_its_name_as_its_type)
{
    EXPECT_EQ(packed_fields({{KT_INT32, "counter"}, {KT_CHAR_PTR, "b"}}),
              (fields{std::to_string(word_of("coun")) + ":ter", "8:b"}));
}

TEST(packing_definitions, a_first_name_of_four_letters_leaves_the_empty_name)
{
    EXPECT_EQ(packed_fields({{KT_INT32, "name"}, {KT_CHAR_PTR, "other"}}),
              (fields{std::to_string(word_of("name")) + ":", "8:other"}));
}

TEST(packing_definitions, behind_a_shorter_first_name_the_fields_are_read_shifted)
{
    if constexpr (std::endian::native == std::endian::big)
        GTEST_SKIP() << "the bytes of the second type stand the other way round";
    // 61 62 00 08 | 00: the name ends at the next byte; then 00 00 63 64 is the type, and the name is empty.
    std::uint32_t first = 0, second = 0;
    std::memcpy(&first, "ab\0\x08", 4);
    std::memcpy(&second, "\0\0cd", 4);
    EXPECT_EQ(packed_fields({{KT_INT32, "ab"}, {KT_CHAR_PTR, "cd"}}),
              (fields{std::to_string(first) + ":", std::to_string(second) + ":"}));
}

TEST(packing_definitions, a_walk_that_leaves_the_metadata_record_is_refused)
{
    kt_int32_t rc = 0;
    packed_fields({{0x41414141, "abc"}, {0x41414141, "abc"}, {0x41414141, "abc"}}, &rc);
    EXPECT_EQ(rc, RG_E_INTERNAL);
}

TEST(packing_definitions, a_definition_without_fields_has_two_empty_arrays)
{
    EXPECT_EQ(packed_fields({}), fields{});
}

TEST(packing_definitions, only_structured_data_has_the_long_form)
{
    open_tree   tree;
    table_maker maker;
    octets      buffer = packed({{maker.create(tree, table_of_everything())}});
    for (const model & sd : item_model(buffer, 0, item::column_metadata).elements)
        EXPECT_EQ(sd.elements.size(), is_structured(static_cast<kt_data_type_t>(sd.elements[1].number)) ? 8u : 6u);
}

TEST(packing_defaults, a_default_of_structured_data_goes_out_as_the_number_zero)
{
    open_tree   tree;
    table_maker maker;
    octets      buffer = packed({{maker.create(tree, table_of_everything())}});
    for (const model & sd : item_model(buffer, 0, item::column_metadata).elements)
        if (is_structured(static_cast<kt_data_type_t>(sd.elements[1].number))) {
            EXPECT_EQ(sd.elements[4].type, static_cast<kt_data_type_t>(KT_UINT32));
            EXPECT_EQ(sd.elements[4].number, 0u);
        } else {
            EXPECT_EQ(sd.elements[4].type, sd.elements[1].number);
        }
}

TEST(packing_defaults, a_missing_default_goes_out_as_the_empty_value)
{
    open_tree   tree;
    table_maker maker;
    table_model table = table_of_everything();
    for (column_model & c : table.columns)
        c.default_value = {};
    table.rows.clear();
    octets buffer = packed({{maker.create(tree, table)}});
    EXPECT_EQ(to_hex(buffer), to_hex(buffer_of({packed_form(table, machine::here)}, machine::here)));
}

TEST(packing_defaults, a_damaged_default_is_refused)
{
    open_tree          tree;
    rg_opaque_handle_t table                    = table_of_ids(tree, "t", 1);
    const kt_value_t   whole                    = object_of(table).p_columns[1].default_value;
    kt_value_t         wild                     = whole;
    wild.val_uint64                             = 0x0000000800000000u + 0x10; // offset 16, length 8
    object_of(table).p_columns[1].default_value = wild;
    octets buffer;
    EXPECT_EQ(pack({{table}}, &buffer), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("kt_pmsg_build_conv_packed_client_value"), std::string::npos);
    object_of(table).p_columns[1].default_value = whole;
    EXPECT_EQ(pack({{table}}, &buffer), 0);
}

// ---- Arguments, faults, locks, trace ----

TEST(packing_badly, missing_arguments_are_refused)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 1);
    rg_opaque_handle_t none  = nullptr;
    kt_uint32_t        zero = 0, one = 1;
    void *             p_buffer = nullptr;
    EXPECT_EQ(rg_pack_tables_1(0, nullptr, nullptr, nullptr, nullptr, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, nullptr, &zero, &zero, nullptr, &p_buffer), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, &table, nullptr, &zero, nullptr, &p_buffer), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, &table, &zero, nullptr, nullptr, &p_buffer), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, &table, &zero, &one, nullptr, &p_buffer), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, &table, &zero, &zero, nullptr, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_pack_tables_1(1, &none, &zero, &zero, nullptr, &p_buffer), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
    EXPECT_EQ(p_buffer, nullptr);
}

TEST(packing_badly, each_allocation_that_fails_leaves_nothing)
{
    open_tree                tree;
    table_maker              maker;
    table_model              table      = table_of_everything();
    const rg_opaque_handle_t everything = maker.create(tree, table);
    rg_opaque_handle_t       handles[]  = {everything, everything};
    kt_uint32_t              visible[]  = {0, 1};
    kt_uint32_t              totals[]   = {0, 1};
    kt_uint32_t              chosen[]   = {1};
    void *                   p_buffer   = nullptr;
    fail_each_allocation([&] { return rg_pack_tables_1(2, handles, visible, totals, chosen, &p_buffer); },
                         [&](kt_int32_t rc) { EXPECT_EQ(p_buffer != nullptr, rc == 0); });
    std::free(p_buffer);
    EXPECT_EQ(set_fields_by_fixed_index(everything, 0, {{"c2", int32(5)}}), 0) << "no lock is left behind";
}

TEST(packing_badly, a_lock_that_fails_gives_back_the_others)
{
    open_tree          tree;
    rg_opaque_handle_t tables[] = {table_of_ids(tree, "a", 1), table_of_ids(tree, "b", 1), table_of_ids(tree, "c", 1)};
    for (unsigned nth = 1; nth <= 3; ++nth) {
        octets buffer;
        {
            fault_scope faults;
            fail_call(call::mutex_lock, nth, EDEADLK);
            EXPECT_EQ(pack({{tables[0]}, {tables[1]}, {tables[2]}}, &buffer), RG_E_SYSTEM_CALL);
            ASSERT_TRUE(failed_as_asked(call::mutex_lock));
        }
        for (rg_opaque_handle_t table : tables)
            EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"text", string("x")}}), 0) << nth;
    }
}

TEST(packing, a_call_makes_its_two_events_and_clears_the_error_record)
{
    open_tree          tree;
    rg_opaque_handle_t table = table_of_ids(tree, "t", 1);
    octets             buffer;
    trace_catcher      catcher(1, 1);
    EXPECT_EQ(pack({{table, 0, {99}}}, &buffer), RG_E_ROW_DELETED);
    ASSERT_EQ(catcher.events().size(), 3u);
    EXPECT_EQ(catcher.events()[0].id, 109u);
    EXPECT_EQ(catcher.events()[1].kind, TR_EVENT_ERROR);
    EXPECT_EQ(catcher.events()[1].function, "rg_i_get_table_row_array_by_fixed_index");
    EXPECT_EQ(catcher.events()[2].id, 110u);
    EXPECT_EQ(catcher.events()[2].values, (std::vector<std::uint32_t>{RG_E_ROW_DELETED}));
    EXPECT_EQ(pack({{table}}, &buffer), 0);
    EXPECT_EQ(error_code(), 0);
}

TEST(threads_packing, a_buffer_holds_one_moment_of_all_tables)
{
    open_tree                tree;
    const rg_opaque_handle_t a = create_hashed_table(tree, "a", id_and_text(), explicit_writing);
    const rg_opaque_handle_t b = create_hashed_table(tree, "b", id_and_text(), explicit_writing);
    std::atomic<bool>        stop{false};
    std::thread              writer([&] {
        for (std::uint32_t id = 0; id < 200; ++id) {
            EXPECT_EQ(add_row(a, {{"id", uint32(id)}}), 0);
            EXPECT_EQ(commit(a), 0);
            EXPECT_EQ(add_row(b, {{"id", uint32(id)}}), 0);
            EXPECT_EQ(commit(b), 0);
        }
        stop = true;
    });
    do {
        octets     buffer = packed({{a}, {b}});
        const auto rows_a = row_count(buffer, 0), rows_b = row_count(buffer, 1);
        EXPECT_TRUE(rows_a == rows_b || rows_a == rows_b + 1) << rows_a << " and " << rows_b;
        EXPECT_EQ(told_rows(buffer, 0), rows_a);
        std::this_thread::yield();
    } while (!stop);
    writer.join();
}
