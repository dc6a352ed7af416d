// SPDX-License-Identifier: MIT
// item_forms: the bytes of each form of a stored value, written out by hand. These are the examples of
// docs/PACKED-FORMAT.md.
#include <gtest/gtest.h>

#include <bit>

#include "pmsg/value_kit.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

// Builds the value with its item at offset 0 of room that is full of old bytes, and compares with the bytes that a
// little-endian machine writes.
void expect_stored(const model & m, const std::string & slot, const std::string & item)
{
    client_values    clients;
    const kt_value_t value = clients.make(m);

    bytes         built(8 + 200, 0xEE);
    kt_uint32_t   offset = 0;
    kt_pmsg_len_t size   = 0;
    ASSERT_EQ(
        kt_pmsg_build_conv_protocol_value_1(nullptr, 0, m.type, &value, built.data(), built.data() + 8, 200, &offset),
        0);
    ASSERT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, m.type, &value, &size), 0);
    built.resize(8 + offset);

    bytes expected = from_hex(slot + item);
    EXPECT_EQ(size, offset);
    EXPECT_EQ(8 + offset, expected.size());
    if (std::endian::native == std::endian::big) {
        ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(expected.data(), m.type, expected.data() + 8), 0);
    }
    EXPECT_EQ(to_hex(built), to_hex(expected));
}

} // namespace

TEST(item_forms, a_32_bit_number_stands_in_the_first_half_of_its_slot_and_the_other_is_zero)
{
    expect_stored(a_number(KT_INT32, 0xFFFFFFFE), "feffffff 00000000", "");
    expect_stored(a_number(KT_UINT32, 0x01020304), "04030201 00000000", "");
    expect_stored(a_number(KT_FLOAT32, 0x3FC00000), "0000c03f 00000000", ""); // 1.5
}

TEST(item_forms, a_64_bit_number_fills_its_slot)
{
    expect_stored(a_number(KT_INT64, 0xFFFFFFFFFFFFFFFE), "feffffffffffffff", "");
    expect_stored(a_number(KT_UINT64, 0x0102030405060708), "0807060504030201", "");
    expect_stored(a_number(KT_FLOAT64, 0x3FF8000000000000), "000000000000f83f", ""); // 1.5
}

TEST(item_forms, a_string_is_its_bytes_and_a_terminator_that_counts)
{
    expect_stored(a_string("ab"), "00000000 03000000", "616200");
    expect_stored(a_string(""), "00000000 01000000", "00");
}

TEST(item_forms, a_binary_is_a_length_word_and_its_bytes)
{
    expect_stored(a_binary(std::string("\x0a\x00\x1f", 3)), "00000000 07000000",
                  "03000000" // length
                  "0a001f");
    expect_stored(a_binary(""), "00000000 04000000", "00000000");
}

TEST(item_forms, a_resource_handle_is_five_words)
{
    expect_stored(a_handle(1, 2, 3, 4, 0x01020304), "00000000 14000000",
                  "01000000"                              // header
                  "02000000 03000000 04000000 04030201"); // id1 to id4
}

TEST(item_forms, an_sbs_is_a_length_word_and_its_fields)
{
    expect_stored(an_sbs({{.type = KT_UINT32, .number = 7, .sn = 1}, {.type = KT_CHAR_PTR, .text = "ab", .sn = 2}}),
                  "00000000 12000000",
                  "0e000000"            // length of what follows
                  "0400 03 01 07000000" // field 1: length of its data, type, number, data
                  "0200 08 02 6162");   // field 2
    expect_stored(an_sbs({}), "00000000 04000000", "00000000");
}

TEST(item_forms, an_array_of_numbers_is_a_count_a_pad_and_slots)
{
    expect_stored(numbers(KT_INT32_ARRAY, {1, 0xFFFFFFFF}), "00000000 18000000",
                  "02000000 00000000"   // element_count, pad
                  "01000000 00000000"   // slot 0: 1
                  "ffffffff 00000000"); // slot 1: -1
    expect_stored(numbers(KT_UINT64_ARRAY, {0x0102030405060708}), "00000000 10000000",
                  "01000000 00000000"  // element_count, pad
                  "0807060504030201"); // slot 0
    expect_stored(numbers(KT_FLOAT64_ARRAY, {}), "00000000 08000000", "00000000 00000000");
}

TEST(item_forms, an_array_of_strings_has_anchors_that_count_from_its_own_first_byte)
{
    expect_stored(an_array(KT_CHAR_PTR_ARRAY, {a_string("one"), a_string("")}), "00000000 1d000000",
                  "02000000 00000000" // element_count, pad
                  "18000000 04000000" // slot 0: offset 24, length 4
                  "1c000000 01000000" // slot 1: offset 28, length 1
                  "6f6e6500"          // "one"
                  "00");              // ""
}

TEST(item_forms, an_array_of_binaries_lays_them_one_behind_the_other_with_no_alignment)
{
    expect_stored(an_array(KT_BINARY_PTR_ARRAY, {a_binary("x"), a_binary("yz")}), "00000000 23000000",
                  "02000000 00000000" // element_count, pad
                  "18000000 05000000" // slot 0: offset 24, length 5
                  "1d000000 06000000" // slot 1: offset 29, length 6
                  "01000000 78"
                  "02000000 797a");
}

TEST(item_forms, an_array_of_resource_handles_has_an_item_of_20_bytes_for_each)
{
    expect_stored(an_array(KT_RSRC_HANDLE_PTR_ARRAY, {a_handle(1, 2, 3, 4, 5)}), "00000000 24000000",
                  "01000000 00000000" // element_count, pad
                  "10000000 14000000" // slot 0: offset 16, length 20
                  "01000000 02000000 03000000 04000000 05000000");
}

TEST(item_forms, structured_data_has_the_type_of_each_element_ahead_of_its_slot)
{
    expect_stored(structured({a_number(KT_UINT32, 7), a_string("ab"), a_number(KT_INT64, 0xFFFFFFFFFFFFFFFF)}),
                  "00000000 3b000000",
                  "03000000 00000000" // element_count, pad
                  "03000000 00000000" // element 0: KT_UINT32, pad
                  "07000000 00000000" //   7
                  "08000000 00000000" // element 1: KT_CHAR_PTR, pad
                  "38000000 03000000" //   offset 56, length 3
                  "04000000 00000000" // element 2: KT_INT64, pad
                  "ffffffff ffffffff" //   -1
                  "616200");          // "ab"
    expect_stored(structured({}), "00000000 08000000", "00000000 00000000");
}

TEST(item_forms, inner_anchors_count_from_the_innermost_item_that_encloses_them)
{
    expect_stored(an_array(KT_SD_PTR_ARRAY, {structured({a_string("x")}), structured({})}), "00000000 3a000000",
                  "02000000 00000000"   // element_count, pad
                  "18000000 1a000000"   // slot 0: offset 24, length 26
                  "32000000 08000000"   // slot 1: offset 50, length 8
                  "01000000 00000000"   // element 0: element_count, pad
                  "08000000 00000000"   //   KT_CHAR_PTR, pad
                  "18000000 02000000"   //   offset 24 from here, length 2
                  "7800"                //   "x"
                  "00000000 00000000"); // element 1: no elements
}

TEST(item_forms, every_sample_is_built_as_its_form_tells)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        const stored     expected = stored_of(m);
        client_values    clients;
        const kt_value_t value = clients.make(m);

        stored built;
        built.slot.fill(0xEE);
        built.area.assign(expected.area.size(), 0xEE);
        kt_uint32_t offset = 0;
        EXPECT_EQ(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, m.type, &value, built.slot.data(), built.area.data(),
                                                      static_cast<kt_uint32_t>(built.area.size()), &offset),
                  0);
        EXPECT_EQ(offset, expected.area.size());
        EXPECT_EQ(to_hex(octets(built.slot.begin(), built.slot.end())),
                  to_hex(octets(expected.slot.begin(), expected.slot.end())));
        EXPECT_EQ(to_hex(built.area), to_hex(expected.area));
    }
}
