// SPDX-License-Identifier: MIT
// converting: packed buffers of a machine of the other byte order, made by hand, put into local order.
#include <gtest/gtest.h>

#include <cstdlib>

#include "protocol/hostile_kit.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

constexpr std::uint8_t local_props   = std::endian::native == std::endian::big ? 3 : 2;
constexpr std::uint8_t foreign_props = local_props ^ 1;

const row_words telling_words = {0x1122334455667788, 2, 0x01020304, 0x0A0B0C0D, 0xCAFE0001};

table_model small_table(const std::string & path = "small")
{
    return {path,
            {{"id", KT_UINT32, a_number(KT_UINT32, 1), RG_PRIMARY_KEY}, {"text", KT_CHAR_PTR, a_string("none")}},
            {{a_number(KT_UINT32, 0x01020304), a_string("one")}, {a_number(KT_UINT32, 2), a_string("two")}}};
}

octets foreign_buffer(const std::vector<table_model> & tables, const row_words & words = telling_words)
{
    std::vector<packed_model> forms;
    for (const table_model & table : tables)
        forms.push_back(packed_form(table, machine::other, words));
    return buffer_of(forms, machine::other);
}

// What a conversion should make of it: everything in local order, but for the words that stay or go.
octets converted_buffer(const std::vector<table_model> & tables, const row_words & words = telling_words)
{
    std::vector<packed_model> forms;
    for (const table_model & table : tables)
        forms.push_back(packed_form(table, machine::here, words));
    octets buffer = buffer_of(forms, machine::here);
    for (size_t table = 0; table < tables.size(); ++table)
        for (size_t row = 0; row < tables[table].rows.size(); ++row) {
            const size_t at = row_start(buffer, table, row);
            put(buffer, at + 4, std::uint64_t{0}, machine::here);
            put(buffer, at + 16, words.disk_table_offset, machine::other);
            put(buffer, at + 20, std::uint32_t{0}, machine::here);
            put(buffer, at + word_at(buffer, at), words.behind, machine::other);
        }
    put(buffer, 16, std::uint32_t{1}, machine::other);
    put(buffer, 24, static_cast<std::uint32_t>(buffer.size()), machine::other);
    return buffer;
}

kt_int32_t convert(octets & buffer)
{
    return rg_convert_packed_table_buffer_1(buffer.data(), 0, 0);
}

} // namespace

TEST(converting_a_buffer, every_part_is_treated_as_the_format_says)
{
    const std::vector<table_model> tables = {table_of_everything("first"), small_table(), table_of_everything("last")};
    octets                         buffer = foreign_buffer(tables);
    ASSERT_EQ(convert(buffer), 0) << error_text();
    EXPECT_EQ(to_hex(buffer), to_hex(converted_buffer(tables)));
}

TEST(converting_a_buffer, a_buffer_without_tables_and_a_table_without_rows)
{
    octets none = buffer_of({}, machine::other);
    ASSERT_EQ(convert(none), 0);
    EXPECT_EQ(to_hex(none), to_hex(converted_buffer({})));

    table_model table = table_of_everything();
    table.rows.clear();
    octets buffer = foreign_buffer({table});
    ASSERT_EQ(convert(buffer), 0);
    EXPECT_EQ(to_hex(buffer), to_hex(converted_buffer({table})));
}

TEST(converting_a_buffer, a_buffer_may_lie_at_any_address)
{
    const octets foreign = foreign_buffer({table_of_everything()});
    octets       shifted(foreign.size() + 3, 0xEE);
    std::copy(foreign.begin(), foreign.end(), shifted.begin() + 3);
    ASSERT_EQ(rg_convert_packed_table_buffer_1(&shifted[3], 0, 0), 0);
    EXPECT_EQ(octets(shifted.begin() + 3, shifted.end()), converted_buffer({table_of_everything()}));
}

TEST(converting_a_buffer, a_local_buffer_is_left_as_it_is)
{
    octets       buffer = buffer_of({packed_form(small_table(), machine::here, telling_words)}, machine::here);
    const octets before = buffer;
    EXPECT_EQ(convert(buffer), 0);
    EXPECT_EQ(buffer, before);
}

TEST(converting_a_buffer, a_second_conversion_does_nothing)
{
    octets buffer = foreign_buffer({small_table()});
    ASSERT_EQ(convert(buffer), 0);
    EXPECT_EQ(buffer[5], local_props);
    const octets before = buffer;
    EXPECT_EQ(convert(buffer), 0);
    EXPECT_EQ(buffer, before);
}

TEST(converting_a_buffer, a_caller_who_has_converted_the_header_has_the_verdict)
{
    octets buffer = foreign_buffer({small_table()});
    put(buffer, 0, static_cast<std::uint32_t>(buffer.size()), machine::here);
    const octets before = buffer;
    EXPECT_EQ(rg_convert_packed_table_buffer_1(buffer.data(), 1, 0), 0);
    EXPECT_EQ(buffer, before) << "told not to";
    ASSERT_EQ(buffer[5], foreign_props);
    EXPECT_EQ(rg_convert_packed_table_buffer_1(buffer.data(), 1, 1), 0);
    EXPECT_EQ(to_hex(buffer), to_hex(converted_buffer({small_table()})));
    const octets converted = buffer;
    EXPECT_EQ(convert(buffer), 0);
    EXPECT_EQ(buffer, converted) << "and the header says so";
}

TEST(converting_a_buffer, the_spare_bytes_of_a_record_do_no_harm)
{
    const table_model table = small_table();
    packed_model      form  = packed_form(table, machine::other);
    form.rows.elements[1]   = row_binary(table.rows[1], machine::other, {}, 21);
    octets buffer           = buffer_of({form}, machine::other);
    ASSERT_EQ(convert(buffer), 0);
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table);
}

TEST(converting_a_buffer, values_of_a_row_may_stand_in_any_order)
{
    table_model table{"t",
                      {{"id", KT_UINT32, {}, RG_PRIMARY_KEY}, {"a", KT_CHAR_PTR}, {"b", KT_INT32_ARRAY}},
                      {{a_number(KT_UINT32, 1), a_string("first"), numbers(KT_INT32_ARRAY, {7, 8})}}};
    // The items of the two change places in the row.
    packed_model  form      = packed_form(table, machine::other);
    std::string & row       = form.rows.elements[0].text;
    const octets  text_item = item_of(table.rows[0][1], machine::other),
                 array_item = item_of(table.rows[0][2], machine::other);
    octets       bytes(row.begin(), row.end());
    const size_t slots = 20, indirect = slots + 24;
    std::copy(array_item.begin(), array_item.end(), bytes.begin() + indirect);
    std::copy(text_item.begin(), text_item.end(), bytes.begin() + indirect + static_cast<long>(array_item.size()));
    put(bytes, slots + 8, static_cast<std::uint32_t>(array_item.size()), machine::other);
    put(bytes, slots + 16, std::uint32_t{0}, machine::other);
    row.assign(bytes.begin(), bytes.end());
    octets buffer = buffer_of({form}, machine::other);
    ASSERT_EQ(convert(buffer), 0) << error_text();
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table);
}

// ---- Chosen rows ----

TEST(converting_chosen_rows, the_walk_stops_at_the_end_of_the_array)
{
    const table_model table                = small_table();
    packed_model      form                 = packed_form(table, machine::other);
    form.fixed_metadata.elements[1].number = 1000000;
    octets buffer                          = buffer_of({form}, machine::other);
    ASSERT_EQ(convert(buffer), 0) << error_text();
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table);
}

// The count of the table's metadata is the bound, so rows that were chosen beyond it stay in the sender's order.
TEST(converting_chosen_rows, rows_beyond_the_tables_count_keep_the_senders_order)
{
    table_model  table = small_table();
    packed_model form  = packed_form(table, machine::other);
    form.rows.elements.push_back(row_binary({a_number(KT_UINT32, 0x0000ABCD), a_string("x")}, machine::other));
    octets buffer = buffer_of({form}, machine::other);
    ASSERT_EQ(convert(buffer), 0) << error_text();
    EXPECT_EQ(word_at(buffer, row_start(buffer, 0, 1) + 24), 2u);
    EXPECT_EQ(word_at(buffer, row_start(buffer, 0, 2) + 24), __builtin_bswap32(0x0000ABCD));
    EXPECT_EQ(word_at(buffer, row_start(buffer, 0, 2)), form.rows.elements[2].text.size()) << "but for the length word";
}

TEST(converting_chosen_rows, no_row_is_converted_if_the_table_tells_of_none)
{
    packed_model form                      = packed_form(small_table(), machine::other);
    form.fixed_metadata.elements[1].number = 0;
    octets buffer                          = buffer_of({form}, machine::other);
    ASSERT_EQ(convert(buffer), 0);
    EXPECT_EQ(word_at(buffer, row_start(buffer, 0, 1) + 24), __builtin_bswap32(2));
}

// ---- Damaged buffers ----

namespace
{

// A foreign buffer of the small table, changed by the test, must be refused.
void expect_refused(const packed_model & form, kt_int32_t result, const std::string & operation)
{
    octets           buffer = buffer_of({form}, machine::other);
    exact_block      block(buffer);
    const kt_int32_t rc = rg_convert_packed_table_buffer_1(block.data(), 0, 0);
    EXPECT_EQ(rc, RG_E_LIBRARY_CALL);
    expect_library_error(operation, result);
}

constexpr char converting[] = "kt_pmsg_convert_pmsg_value";
constexpr char reading_op[] = "kt_pmsg_build_conv_packed_client_value";

} // namespace

TEST(converting_badly, no_buffer)
{
    EXPECT_EQ(rg_convert_packed_table_buffer_1(nullptr, 0, 0), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_convert_packed_table_buffer_1(nullptr, 1, 1), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
}

TEST(converting_badly, a_header_that_is_none)
{
    octets buffer = foreign_buffer({small_table()});
    buffer[4]     = 7;
    EXPECT_EQ(convert(buffer), RG_E_LIBRARY_CALL);
    expect_library_error("kt_pmsg_cnv_required", 4);
}

TEST(converting_badly, a_length_below_the_fixed_part)
{
    for (std::uint32_t length = 8; length < 72; ++length) {
        octets buffer = foreign_buffer({small_table()});
        buffer.resize(length);
        put(buffer, 0, length, machine::other);
        exact_block block(buffer);
        EXPECT_EQ(rg_convert_packed_table_buffer_1(block.data(), 0, 0), RG_E_LIBRARY_CALL) << length;
        expect_library_error(converting, 4);
    }
}

TEST(converting_badly, a_count_of_tables_that_the_length_cannot_hold)
{
    for (const std::uint32_t count : {2u, 200u, 0x07FFFFFFu, 0x08000000u, 0x7FFFFFFFu, 0xFFFFFFFEu, 0xFFFFFFFFu}) {
        octets buffer = foreign_buffer({small_table()});
        buffer.resize(100);
        put(buffer, 0, std::uint32_t{100}, machine::other);
        put(buffer, 32, count, machine::other);
        exact_block block(buffer);
        EXPECT_EQ(rg_convert_packed_table_buffer_1(block.data(), 0, 0), RG_E_LIBRARY_CALL) << count;
        expect_library_error(converting, 4);
    }
}

TEST(converting_badly, anchors_that_leave_the_buffer)
{
    for (size_t slot = 40; slot < 72; slot += 4) {
        octets buffer = foreign_buffer({small_table()});
        put(buffer, slot, 0xFFFFFFF0u, machine::other);
        exact_block block(buffer);
        EXPECT_EQ(rg_convert_packed_table_buffer_1(block.data(), 0, 0), RG_E_LIBRARY_CALL) << slot;
        expect_library_error(converting, 4);
    }
}

TEST(converting_badly, tables_that_share_their_items)
{
    // Otherwise a buffer of a megabyte could ask for tens of thousands of conversions of itself.
    octets buffer = foreign_buffer({small_table(), small_table()});
    std::copy(buffer.begin() + 40, buffer.begin() + 72, buffer.begin() + 72);
    EXPECT_EQ(convert(buffer), RG_E_LIBRARY_CALL);
}

TEST(converting_badly, values_of_a_row_that_share_their_items)
{
    table_model   table{"t",
                      {{"id", KT_UINT32, {}, RG_PRIMARY_KEY}, {"a", KT_CHAR_PTR}, {"b", KT_CHAR_PTR}},
                      {{a_number(KT_UINT32, 1), a_string("one and the same"), a_string("")}}};
    packed_model  form = packed_form(table, machine::other);
    std::string & row  = form.rows.elements[0].text;
    row.replace(20 + 16, 8, row, 20 + 8, 8);
    expect_refused(form, 4, converting);
}

TEST(converting_badly, a_row_shorter_than_its_slots)
{
    packed_model form = packed_form(small_table(), machine::other);
    form.rows.elements[0].text.resize(20 + 16 - 1); // record_length is one short of the head, the word and two slots
    expect_refused(form, 4, converting);
    form.rows.elements[0].text.resize(0);
    expect_refused(form, 4, converting);
}

TEST(converting_badly, a_row_whose_anchors_leave_it)
{
    for (const size_t half : {0, 4}) {
        packed_model form = packed_form(small_table(), machine::other);
        form.rows.elements[1].text.replace(20 + 8 + half, 4, std::string(4, '\x7F'));
        expect_refused(form, 4, converting);
    }
}

TEST(converting_badly, more_columns_than_are_told)
{
    packed_model form                      = packed_form(small_table(), machine::other);
    form.fixed_metadata.elements[2].number = 3;
    expect_refused(form, 4, reading_op);
    form.fixed_metadata.elements[2].number = 0xFFFFFFFF;
    expect_refused(form, 4, reading_op);
}

TEST(converting_badly, a_type_that_is_none)
{
    for (const std::uint32_t type : {0u, 1u, 23u, 0xFFFFFFFFu}) {
        packed_model form                                   = packed_form(small_table(), machine::other);
        form.column_metadata.elements[1].elements[1].number = type;
        expect_refused(form, 1, converting);
    }
}

TEST(converting_badly, metadata_of_another_form)
{
    packed_model form               = packed_form(small_table(), machine::other);
    form.fixed_metadata.elements[1] = a_string("rows");
    expect_refused(form, 4, reading_op);
    form = packed_form(small_table(), machine::other);
    form.fixed_metadata.elements.resize(2);
    expect_refused(form, 4, reading_op);
    form                                         = packed_form(small_table(), machine::other);
    form.column_metadata.elements[0].elements[1] = a_number(KT_UINT64, 3);
    expect_refused(form, 4, reading_op);
    form = packed_form(small_table(), machine::other);
    form.column_metadata.elements[0].elements.clear();
    expect_refused(form, 4, reading_op);
}

TEST(converting_badly, each_allocation_that_fails_is_told_and_leaves_nothing)
{
    for (unsigned nth = 1;; ++nth) {
        octets      buffer = foreign_buffer({small_table()});
        fault_scope faults;
        ku_set_no_error_1();
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc     = convert(buffer);
        const bool       failed = failed_as_asked(call::allocation);
        reset_calls();
        if (!failed) {
            EXPECT_EQ(rc, 0);
            EXPECT_EQ(nth, 3u) << "the fixed metadata and the columns are looked at";
            break;
        }
        EXPECT_EQ(rc, RG_E_LIBRARY_CALL);
        expect_library_error(reading_op, 3);
    }
}

TEST(converting_badly, every_byte_changed_is_survived)
{
    const octets original =
        foreign_buffer({small_table("a"), {"b", {{"k", KT_CHAR_PTR, {}, RG_PRIMARY_KEY}}, {{a_string("x")}}}});
    change_each_byte(original, [](octets & buffer) { use_hostile_buffer(buffer); });
}

TEST(converting_badly, every_length_is_survived)
{
    const octets original = foreign_buffer({small_table("a"), small_table("b")});
    for (size_t length = 0; length <= original.size(); ++length) {
        octets buffer = original;
        buffer.resize(std::max<size_t>(length, 8));
        put(buffer, 0, static_cast<std::uint32_t>(length), machine::other);
        use_hostile_buffer(buffer);
    }
}

TEST(converting_a_buffer, a_call_makes_its_two_events_and_clears_the_error_record)
{
    octets        buffer = foreign_buffer({small_table()});
    trace_catcher catcher(1, 1);
    EXPECT_EQ(rg_convert_packed_table_buffer_1(nullptr, 0, 0), RG_E_NULL_POINTER);
    EXPECT_EQ(convert(buffer), 0);
    EXPECT_EQ(error_code(), 0);
    ASSERT_EQ(catcher.events().size(), 5u);
    EXPECT_EQ(catcher.events()[0].id, 117u);
    EXPECT_EQ(catcher.events()[2].id, 118u);
    EXPECT_EQ(catcher.events()[2].values, (std::vector<std::uint32_t>{RG_E_NULL_POINTER}));
    EXPECT_EQ(catcher.events()[4].values, (std::vector<std::uint32_t>{0}));
}
