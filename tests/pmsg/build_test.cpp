// SPDX-License-Identifier: MIT
// build: making stored values and measuring them: room, offsets, NULLs, refusals.
#include <gtest/gtest.h>

#include <cstdlib>

#include "pmsg/value_kit.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

struct room {
    std::array<std::uint8_t, 8> slot;
    octets                      area;
    kt_uint32_t                 offset;

    room(std::size_t bytes, kt_uint32_t start) : area(bytes, 0xEE), offset(start) { slot.fill(0xEE); }
    bool operator==(const room &) const = default;

    kt_int32_t build(kt_data_type_t type, const kt_value_t & value, ku_iconv_t * p_handle = nullptr)
    {
        return kt_pmsg_build_conv_protocol_value_1(p_handle, 0, type, &value, slot.data(), area.data(),
                                                   static_cast<kt_uint32_t>(area.size()), &offset);
    }
};

kt_uint32_t size_of(kt_data_type_t type, const kt_value_t & value)
{
    kt_pmsg_len_t size = 0xEEEEEEEE;
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, type, &value, &size), 0);
    return size;
}

// The stored value that a client value gives, in room just large enough.
stored built(kt_data_type_t type, const kt_value_t & value)
{
    room r(size_of(type, value), 0);
    EXPECT_EQ(r.build(type, value), 0);
    return {r.slot, r.area};
}

// The types whose values lie behind a pointer.
constexpr kt_data_type_t first_indirect = KT_CHAR_PTR;
constexpr kt_data_type_t last_type      = KT_SD_PTR_ARRAY;

model empty_of(kt_data_type_t type)
{
    return {.type = type};
}

} // namespace

TEST(building, the_size_is_what_the_running_offset_grows_by)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        client_values    clients;
        const kt_value_t value = clients.make(m);
        room             r(2000, 77);
        ASSERT_EQ(r.build(m.type, value), 0);
        EXPECT_EQ(size_of(m.type, value), r.offset - 77);
    }
}

TEST(building, room_that_is_exactly_enough_is_enough)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        client_values    clients;
        const kt_value_t value    = clients.make(m);
        const stored     expected = stored_of(m, machine::here, is_number(m.type) ? 0 : 13);
        room             r(expected.area.size(), is_number(m.type) ? 0 : 13);
        ASSERT_EQ(r.build(m.type, value), 0);
        EXPECT_EQ(r.slot, expected.slot);
        EXPECT_EQ(to_hex(r.area), to_hex(expected.area));
        EXPECT_EQ(r.offset, expected.area.size());
    }
}

TEST(building, one_byte_too_little_room_gives_5_and_nothing_is_written)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue; // a number takes no room
        client_values    clients;
        const kt_value_t value = clients.make(m);
        room             r(13 + size_of(m.type, value) - 1, 13);
        const room       before = r;
        EXPECT_EQ(r.build(m.type, value), KT_PMSG_E_NO_ROOM);
        EXPECT_EQ(r, before);
    }
}

TEST(building, no_amount_of_missing_room_writes_anything)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        client_values    clients;
        const kt_value_t value = clients.make(m);
        for (kt_uint32_t bytes = 0; bytes < size_of(m.type, value); ++bytes) {
            room       r(bytes, 0);
            const room before = r;
            EXPECT_EQ(r.build(m.type, value), KT_PMSG_E_NO_ROOM);
            EXPECT_EQ(r, before);
        }
    }
}

TEST(building, a_running_offset_beyond_the_room_gives_5)
{
    const kt_value_t value = string("x");
    room             r(10, 11);
    const room       before = r;
    EXPECT_EQ(r.build(KT_CHAR_PTR, value), KT_PMSG_E_NO_ROOM);
    EXPECT_EQ(r, before);

    r.offset = 0xFFFFFFFF;
    EXPECT_EQ(r.build(KT_CHAR_PTR, value), KT_PMSG_E_NO_ROOM);
}

TEST(building, a_number_takes_no_room_and_leaves_the_running_offset)
{
    room r(0, 5);
    EXPECT_EQ(r.build(KT_INT64, int64(-3)), 0);
    EXPECT_EQ(r.offset, 5u);
    EXPECT_EQ(size_of(KT_INT64, int64(-3)), 0u);
    EXPECT_EQ(r.slot, stored_of(a_number(KT_INT64, static_cast<std::uint64_t>(-3))).slot);
}

TEST(building, a_number_needs_neither_room_nor_a_running_offset)
{
    std::array<std::uint8_t, 8> slot;
    const kt_value_t            value = uint32(9);
    EXPECT_EQ(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, KT_UINT32, &value, slot.data(), nullptr, 0, nullptr), 0);
    EXPECT_EQ(slot, stored_of(a_number(KT_UINT32, 9)).slot);
}

TEST(building, values_follow_each_other_at_the_running_offset)
{
    room r(20, 0);
    ASSERT_EQ(r.build(KT_CHAR_PTR, string("ab")), 0);
    EXPECT_EQ(r.slot, stored_of(a_string("ab"), machine::here, 0).slot);
    ASSERT_EQ(r.build(KT_CHAR_PTR, string("cde")), 0);
    EXPECT_EQ(r.slot, stored_of(a_string("cde"), machine::here, 3).slot);
    EXPECT_EQ(r.offset, 7u);
    EXPECT_EQ(to_hex(octets(r.area.begin(), r.area.begin() + 8)), to_hex(from_hex("616200 63646500 ee")));
}

TEST(building, items_slots_and_values_may_lie_at_any_address)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        const stored     expected = stored_of(m);
        client_values    clients;
        const kt_value_t value = clients.make(m);
        octets           odd_value(9);
        std::memcpy(odd_value.data() + 1, &value, 8);
        octets      odd_slot(9);
        octets      odd_area(1 + expected.area.size());
        kt_uint32_t offset = 0;
        void *      p_odd  = odd_value.data() + 1;
        ASSERT_EQ(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, m.type, static_cast<const kt_value_t *>(p_odd),
                                                      odd_slot.data() + 1, odd_area.data() + 1,
                                                      static_cast<kt_uint32_t>(expected.area.size()), &offset),
                  0);
        EXPECT_TRUE(std::equal(expected.slot.begin(), expected.slot.end(), odd_slot.begin() + 1));
        EXPECT_TRUE(std::equal(expected.area.begin(), expected.area.end(), odd_area.begin() + 1));
    }
}

// A default value stands as an item in its table, and packing hands it over as if it were a client's.
TEST(building, an_item_of_a_form_without_anchors_serves_as_a_client_value_at_any_address)
{
    for (const model & m : samples()) {
        const bool without_anchors = m.type == KT_CHAR_PTR || m.type == KT_BINARY_PTR || m.type == KT_SBS_PTR ||
                                     m.type == KT_RSRC_HANDLE_PTR ||
                                     (m.type >= KT_INT32_ARRAY && m.type <= KT_FLOAT64_ARRAY);
        if (!without_anchors)
            continue;
        SCOPED_TRACE(m.name);
        const stored expected = stored_of(m, machine::here, 1);
        kt_value_t   value;
        value.ptr_char = const_cast<char *>(reinterpret_cast<const char *>(expected.area.data()) + 1);
        EXPECT_EQ(built(m.type, value), stored_of(m));
    }
}

TEST(building, a_null_pointer_stands_for_the_empty_value_of_its_type)
{
    for (kt_data_type_t type = first_indirect; type <= last_type; ++type) {
        SCOPED_TRACE(type);
        EXPECT_EQ(built(type, null_value()), stored_of(empty_of(type)));
    }
}

TEST(building, a_null_pointer_inside_structured_data_stands_for_the_empty_value_of_its_type)
{
    model                                     expected{.type = KT_SD_PTR};
    std::vector<kt_structured_data_element_t> elements;
    for (kt_data_type_t type = first_indirect; type <= last_type; ++type) {
        expected.elements.push_back(empty_of(type));
        elements.push_back({type, 0, null_value()});
    }
    octets     record(8 + 16 * elements.size());
    const auto count = static_cast<std::uint32_t>(elements.size());
    std::memcpy(record.data(), &count, 4);
    std::memcpy(record.data() + 8, elements.data(), 16 * elements.size());
    kt_value_t value;
    value.ptr_char = reinterpret_cast<char *>(record.data());
    EXPECT_EQ(built(KT_SD_PTR, value), stored_of(expected));
}

TEST(building, a_null_pointer_inside_an_array_stands_for_the_empty_value_of_its_type)
{
    for (kt_data_type_t type = KT_CHAR_PTR_ARRAY; type <= KT_SD_PTR_ARRAY; ++type) {
        SCOPED_TRACE(type);
        const kt_data_type_t element_type = type - KT_CHAR_PTR_ARRAY + KT_CHAR_PTR;
        kt_array_t           array        = {1, 0, {null_value()}};
        kt_value_t           value;
        value.ptr_array = &array;
        EXPECT_EQ(built(type, value), stored_of(an_array(type, {empty_of(element_type)})));
    }
}

TEST(building, pads_and_the_other_halves_of_numbers_are_zero_whatever_the_client_left_there)
{
    kt_structured_data_t sd         = {1, 0x11111111, {{KT_UINT32, 0x22222222, {}}}};
    sd.elements[0].value.val_uint64 = 0x3333333333333333;
    sd.elements[0].value.val_uint32 = 5;
    kt_value_t value;
    value.ptr_sd = &sd;
    EXPECT_EQ(built(KT_SD_PTR, value), stored_of(structured({a_number(KT_UINT32, 5)})));

    kt_array_t array             = {1, 0x11111111, {}};
    array.elements[0].val_uint64 = 0x3333333333333333;
    array.elements[0].val_uint32 = 5;
    value.ptr_array              = &array;
    EXPECT_EQ(built(KT_UINT32_ARRAY, value), stored_of(numbers(KT_UINT32_ARRAY, {5})));
}

TEST(building, a_type_that_is_none_gives_1_and_nothing_is_written)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 24u, 0x7FFFFFFFu, 0xFFFFFFFFu}) {
        SCOPED_TRACE(type);
        room          r(100, 3);
        const room    before = r;
        kt_pmsg_len_t size   = 42;
        EXPECT_EQ(r.build(type, string("x")), KT_PMSG_E_UNSUPPORTED_TYPE);
        EXPECT_EQ(r, before);
        const kt_value_t value = string("x");
        EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, type, &value, &size), KT_PMSG_E_UNSUPPORTED_TYPE);
        EXPECT_EQ(size, 42u);
    }
}

TEST(building, an_element_of_no_type_gives_1_and_nothing_is_written)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(type);
        kt_structured_data_t sd = {1, 0, {{type, 0, null_value()}}};
        kt_value_t           value;
        value.ptr_sd = &sd;
        room          r(100, 3);
        const room    before = r;
        kt_pmsg_len_t size   = 42;
        EXPECT_EQ(r.build(KT_SD_PTR, value), KT_PMSG_E_UNSUPPORTED_TYPE);
        EXPECT_EQ(r, before);
        EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_SD_PTR, &value, &size), KT_PMSG_E_UNSUPPORTED_TYPE);
        EXPECT_EQ(size, 42u);
    }
}

TEST(building, an_sbs_of_negative_length_gives_4_and_nothing_is_written)
{
    for (const kt_int32_t length : {-1, INT32_MIN}) {
        kt_sbs_t sbs = {};
        sbs.length   = length;
        kt_value_t value;
        value.ptr_sbs = &sbs;
        room          r(100, 3);
        const room    before = r;
        kt_pmsg_len_t size   = 42;
        EXPECT_EQ(r.build(KT_SBS_PTR, value), KT_PMSG_E_DAMAGED);
        EXPECT_EQ(r, before);
        EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_SBS_PTR, &value, &size), KT_PMSG_E_DAMAGED);
    }
}

TEST(building, values_nested_33_deep_give_4_and_32_deep_are_built)
{
    client_values clients;
    EXPECT_EQ(built(KT_SD_PTR, clients.make(nested(32))), stored_of(nested(32)));

    const kt_value_t value = clients.make(nested(33));
    room             r(2000, 3);
    const room       before = r;
    kt_pmsg_len_t    size   = 42;
    EXPECT_EQ(r.build(KT_SD_PTR, value), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(r, before);
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_SD_PTR, &value, &size), KT_PMSG_E_DAMAGED);
}

TEST(building, a_string_at_level_33_is_too_deep)
{
    model m = structured({a_string("x")});
    for (unsigned level = 1; level < 32; ++level)
        m = structured({std::move(m)});
    client_values    clients;
    const kt_value_t value = clients.make(m);
    kt_pmsg_len_t    size;
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_SD_PTR, &value, &size), KT_PMSG_E_DAMAGED);
}

TEST(building, a_value_that_contains_itself_is_refused)
{
    kt_structured_data_t sd     = {1, 0, {{KT_SD_PTR, 0, {}}}};
    sd.elements[0].value.ptr_sd = &sd;
    kt_value_t value;
    value.ptr_sd = &sd;
    room       r(2000, 3);
    const room before = r;
    EXPECT_EQ(r.build(KT_SD_PTR, value), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(r, before);
}

TEST(building, a_value_longer_than_4_gib_has_no_size)
{
    kt_array_t array = {0x20000000, 0, {}}; // its head alone says so; no element is looked at
    kt_value_t value;
    value.ptr_array    = &array;
    kt_pmsg_len_t size = 42;
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_INT64_ARRAY, &value, &size), KT_PMSG_E_NO_ROOM);
    EXPECT_EQ(size, 42u);
}

TEST(building, missing_arguments_give_4_and_nothing_is_written)
{
    const kt_value_t            value  = string("x");
    std::array<std::uint8_t, 8> slot   = {};
    octets                      area   = octets(10, 0xEE);
    kt_uint32_t                 offset = 0;
    kt_pmsg_len_t               size   = 0;
    EXPECT_EQ(
        kt_pmsg_build_conv_protocol_value_1(nullptr, 0, KT_CHAR_PTR, nullptr, slot.data(), area.data(), 10, &offset),
        KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, KT_CHAR_PTR, &value, nullptr, area.data(), 10, &offset),
              KT_PMSG_E_DAMAGED);
    EXPECT_EQ(
        kt_pmsg_build_conv_protocol_value_1(nullptr, 0, KT_CHAR_PTR, &value, slot.data(), area.data(), 10, nullptr),
        KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_CHAR_PTR, nullptr, &size), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_size_conv_protocol_value_1(1, 0, KT_CHAR_PTR, &value, nullptr), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(area, octets(10, 0xEE));
    EXPECT_EQ(offset, 0u);
}

TEST(building, missing_room_is_no_room)
{
    const kt_value_t            value  = string("x");
    std::array<std::uint8_t, 8> slot   = {};
    kt_uint32_t                 offset = 0;
    EXPECT_EQ(kt_pmsg_build_conv_protocol_value_1(nullptr, 0, KT_CHAR_PTR, &value, slot.data(), nullptr, 10, &offset),
              KT_PMSG_E_NO_ROOM);
    EXPECT_EQ(offset, 0u);
}
