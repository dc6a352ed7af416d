// SPDX-License-Identifier: MIT
// convert: values that a machine of the other byte order wrote, put into this machine's order, and message headers.
#include <gtest/gtest.h>

#include <bit>
#include <cstdlib>

#include "../../support/pmsg/kt_pmsg_i_convert.h"
#include "pmsg/value_kit.h"
#include "support/registry.h"

using namespace kt_test;
using kt_pmsg_i::reverse_value;
using kt_pmsg_i::word_order;

namespace
{

constexpr kt_pmsg_len_t no_bound = 0xFFFFFFFF;

kt_int32_t convert(stored & s, kt_data_type_t type)
{
    return kt_pmsg_convert_pmsg_value_within_1(s.slot.data(), type, s.area.data(),
                                               static_cast<kt_uint32_t>(s.area.size()));
}

kt_int32_t readable(const stored & s, kt_data_type_t type)
{
    kt_value_t       value;
    const kt_int32_t rc = kt_pmsg_build_conv_packed_client_value_1(
        nullptr, 0, type, &value, s.slot.data(), s.area.data(), static_cast<kt_uint32_t>(s.area.size()));
    if (rc == 0 && !is_number(type))
        std::free(value.ptr_char);
    return rc;
}

kt_pmsg_header_t header_of(kt_uint32_t length, std::uint8_t arch_props)
{
    kt_pmsg_header_t header   = {};
    header.kt_pmsg_length     = length;
    header.kt_pmsg_arch_props = arch_props;
    header.kt_pmsg_proto_type = 2;
    return header;
}

constexpr std::uint8_t local_props   = std::endian::native == std::endian::big ? 3 : 2;
constexpr std::uint8_t foreign_props = std::endian::native == std::endian::big ? 2 : 3;

} // namespace

TEST(converting, a_foreign_value_of_every_type_becomes_the_local_one)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        stored s = stored_of(m, machine::other, 5);
        ASSERT_EQ(convert(s, m.type), 0);
        const stored local = stored_of(m, machine::here, 5);
        EXPECT_EQ(s.slot, local.slot);
        EXPECT_EQ(to_hex(s.area), to_hex(local.area));
        EXPECT_EQ(readable(s, m.type), 0);
    }
}

TEST(converting, without_a_bound_the_anchors_are_the_bounds)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        stored s = stored_of(m, machine::other, 5);
        ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(s.slot.data(), m.type, s.area.data()), 0);
        EXPECT_EQ(s, stored_of(m, machine::here, 5));
    }
}

TEST(converting, there_and_back_gives_the_original)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        stored     s      = stored_of(m);
        const auto length = static_cast<kt_uint32_t>(s.area.size());
        ASSERT_EQ(reverse_value(word_order::local, s.slot.data(), m.type, s.area.data(), length), 0);
        EXPECT_EQ(s, stored_of(m, machine::other));
        ASSERT_EQ(reverse_value(word_order::foreign, s.slot.data(), m.type, s.area.data(), length), 0);
        EXPECT_EQ(s, stored_of(m));
    }
}

TEST(converting, slots_and_items_may_lie_at_any_address)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        for (kt_uint32_t offset = 0; offset < 8; ++offset) {
            const stored foreign = stored_of(m, machine::other, offset);
            octets       slots(offset);
            slots.insert(slots.end(), foreign.slot.begin(), foreign.slot.end());
            octets area = foreign.area;
            ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(slots.data() + offset, m.type, area.data()), 0);
            const stored local = stored_of(m, machine::here, offset);
            EXPECT_TRUE(std::equal(local.slot.begin(), local.slot.end(), slots.begin() + offset));
            EXPECT_EQ(area, local.area);
        }
    }
}

TEST(converting, a_number_needs_no_indirect_data)
{
    std::array<std::uint8_t, 8> slot = stored_of(a_number(KT_UINT32, 3), machine::other).slot;
    ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(slot.data(), KT_UINT32, nullptr), 0);
    EXPECT_EQ(slot, stored_of(a_number(KT_UINT32, 3)).slot);
}

TEST(converting, the_bytes_of_a_binary_stay_and_its_length_word_is_reversed)
{
    octets                      item = {0, 0, 0, 4, 1, 2, 3, 4};
    std::array<std::uint8_t, 8> slot = {0, 0, 0, 0, 0, 0, 0, 8};
    if (std::endian::native == std::endian::big) {
        item = {4, 0, 0, 0, 1, 2, 3, 4};
        slot = {0, 0, 0, 0, 8, 0, 0, 0};
    }
    ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(slot.data(), KT_BINARY_PTR, item.data()), 0);
    EXPECT_EQ(octets(item.begin() + 4, item.end()), (octets{1, 2, 3, 4}));
    kt_uint32_t length;
    std::memcpy(&length, item.data(), 4);
    EXPECT_EQ(length, 4u);
}

TEST(converting, the_other_half_of_a_32_bit_number_stays_as_it_is)
{
    std::array<std::uint8_t, 8> slot = {1, 2, 3, 4, 5, 6, 7, 8};
    ASSERT_EQ(kt_pmsg_convert_pmsg_value_1(slot.data(), KT_FLOAT32, nullptr), 0);
    EXPECT_EQ(slot, (std::array<std::uint8_t, 8>{4, 3, 2, 1, 5, 6, 7, 8}));
}

TEST(converting, an_sbs_that_is_not_fields_goes_through_as_bytes)
{
    // Fields that are cut off, a field of negative length, and a field that reaches one byte beyond the last.
    for (const std::string & text : {std::string("abc"), std::string("\xff\xff\2\1", 4), std::string("\0\5\2\1abcd", 8),
                                     std::string("\5\0\2\1abcd", 8)}) {
        stored s = stored_of(an_sbs_of_bytes(text), machine::other);
        ASSERT_EQ(convert(s, KT_SBS_PTR), 0);
        EXPECT_EQ(s, stored_of(an_sbs_of_bytes(text)));
    }
}

TEST(converting, a_field_whose_data_is_not_one_number_keeps_its_bytes)
{
    for (const model & field : {model{.type = KT_CHAR_PTR, .text = "ab"}, model{.type = KT_INT64, .text = "four"},
                                model{.type = KT_INT32_ARRAY, .text = "abcdefgh"}}) {
        stored s = stored_of(an_sbs({field}), machine::other);
        ASSERT_EQ(convert(s, KT_SBS_PTR), 0);
        EXPECT_EQ(s, stored_of(an_sbs({field})));
    }
}

TEST(converting, a_type_that_is_none_gives_1_and_changes_nothing)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 0xFFFFFFFFu}) {
        stored       s      = stored_of(a_string("x"), machine::other);
        const stored before = s;
        EXPECT_EQ(convert(s, type), KT_PMSG_E_UNSUPPORTED_TYPE);
        EXPECT_EQ(s, before);
    }
}

TEST(converting, missing_arguments_give_4)
{
    stored s = stored_of(a_string("x"), machine::other);
    EXPECT_EQ(kt_pmsg_convert_pmsg_value_1(nullptr, KT_CHAR_PTR, s.area.data()), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_convert_pmsg_value_1(nullptr, KT_UINT32, nullptr), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_convert_pmsg_value_1(s.slot.data(), KT_CHAR_PTR, nullptr), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(s, stored_of(a_string("x"), machine::other));
}

// ---- Damage --------------------------------------------------------------------------------------------------------

TEST(converting_damage, every_bound_that_is_too_low_gives_4_and_changes_nothing)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue;
        const stored s = stored_of(m, machine::other, 2);
        for (kt_uint32_t bound = 0; bound < s.area.size(); ++bound) {
            stored       cut    = {s.slot, octets(s.area.begin(), s.area.begin() + bound)};
            const stored before = cut;
            EXPECT_EQ(convert(cut, m.type), KT_PMSG_E_DAMAGED);
            EXPECT_EQ(cut, before);
        }
    }
}

TEST(converting_damage, any_byte_changed_gives_a_readable_value_or_a_code_and_no_change)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        const stored s      = stored_of(m, machine::other);
        const auto   length = static_cast<kt_uint32_t>(s.area.size());
        for (std::size_t at = 0; at < 8 + s.area.size(); ++at)
            for (const unsigned change : {0u, 1u, 2u, 3u}) {
                stored         damaged  = s;
                std::uint8_t & octet    = at < 8 ? damaged.slot[at] : damaged.area[at - 8];
                octet                   = change == 0   ? std::uint8_t{0}
                                          : change == 1 ? std::uint8_t{0xFF}
                                          : change == 2 ? static_cast<std::uint8_t>(~octet)
                                                        : static_cast<std::uint8_t>(octet + 1);
                const stored     before = damaged;
                const kt_int32_t rc     = convert(damaged, m.type);
                if (rc != 0) {
                    EXPECT_TRUE(rc == KT_PMSG_E_DAMAGED || rc == KT_PMSG_E_UNSUPPORTED_TYPE) << rc << " at " << at;
                    EXPECT_EQ(damaged, before);
                    continue;
                }
                EXPECT_EQ(readable(damaged, m.type), 0);
                EXPECT_EQ(reverse_value(word_order::local, damaged.slot.data(), m.type, damaged.area.data(), length),
                          0);
                EXPECT_EQ(damaged, before);
            }
    }
}

TEST(converting_damage, a_local_value_taken_for_a_foreign_one_gives_a_code_and_stays)
{
    stored s = stored_of(an_array(KT_CHAR_PTR_ARRAY, {a_string("one"), a_string("two")}));
    EXPECT_EQ(convert(s, KT_CHAR_PTR_ARRAY), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(s, stored_of(an_array(KT_CHAR_PTR_ARRAY, {a_string("one"), a_string("two")})));
}

TEST(converting_damage, items_nested_33_deep_give_4_and_change_nothing)
{
    stored s = stored_of(nested(33), machine::other);
    EXPECT_EQ(convert(s, KT_SD_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(s, stored_of(nested(33), machine::other));
}

TEST(converting_damage, items_that_overlap_give_4_and_change_nothing)
{
    // Two elements that name one string, which would be reversed twice if it were numbers.
    stored s = stored_of(an_array(KT_RSRC_HANDLE_PTR_ARRAY, {a_handle(1, 2, 3, 4, 5), a_handle(6, 7, 8, 9, 10)}),
                         machine::other);
    std::copy(s.area.begin() + 8, s.area.begin() + 16, s.area.begin() + 16);
    const stored before = s;
    EXPECT_EQ(convert(s, KT_RSRC_HANDLE_PTR_ARRAY), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(s, before);
}

// ---- Message headers -----------------------------------------------------------------------------------------------

TEST(message_headers, a_local_message_needs_no_conversion_and_stays_as_it_is)
{
    for (const std::uint8_t props : {local_props, static_cast<std::uint8_t>(local_props & 1)}) {
        kt_pmsg_header_t       header   = header_of(100, props);
        const kt_pmsg_header_t before   = header;
        kt_int32_t             required = -1;
        ASSERT_EQ(kt_pmsg_cnv_required_1(&header, &required), 0);
        EXPECT_EQ(required, 0);
        EXPECT_EQ(std::memcmp(&header, &before, sizeof header), 0);
    }
}

TEST(message_headers, a_foreign_message_needs_conversion_and_its_header_becomes_local)
{
    for (const std::uint8_t props : {foreign_props, static_cast<std::uint8_t>(foreign_props & 1)}) {
        kt_pmsg_header_t header   = header_of(0x64000000, props);
        kt_int32_t       required = -1;
        ASSERT_EQ(kt_pmsg_cnv_required_1(&header, &required), 0);
        EXPECT_EQ(required, 1);
        EXPECT_EQ(header.kt_pmsg_length, 100u);
        EXPECT_EQ(header.kt_pmsg_arch_props, local_props);
        EXPECT_EQ(header.kt_pmsg_proto_type, 2);
    }
}

TEST(message_headers, a_second_call_finds_nothing_left_to_do)
{
    kt_pmsg_header_t header   = header_of(0x64000000, foreign_props);
    kt_int32_t       required = -1;
    ASSERT_EQ(kt_pmsg_cnv_required_1(&header, &required), 0);
    ASSERT_EQ(kt_pmsg_cnv_required_1(&header, &required), 0);
    EXPECT_EQ(required, 0);
    EXPECT_EQ(header.kt_pmsg_length, 100u);
}

TEST(message_headers, what_no_writer_writes_gives_4_and_changes_nothing)
{
    kt_pmsg_header_t of_later_version = header_of(0x64000000, foreign_props);
    of_later_version.kt_pmsg_version  = 1;
    const kt_pmsg_header_t headers[]  = {
         of_later_version,          header_of(0x64000000, 4 | foreign_props), header_of(100, 0x80 | local_props),
         header_of(7, local_props), header_of(0x07000000, foreign_props),     header_of(0, local_props)};
    for (const kt_pmsg_header_t & header : headers) {
        kt_pmsg_header_t changed  = header;
        kt_int32_t       required = -1;
        EXPECT_EQ(kt_pmsg_cnv_required_1(&changed, &required), KT_PMSG_E_DAMAGED);
        EXPECT_EQ(std::memcmp(&changed, &header, sizeof header), 0);
        EXPECT_EQ(required, -1);
    }
}

TEST(message_headers, missing_arguments_give_4)
{
    kt_pmsg_header_t header   = header_of(0x64000000, foreign_props);
    kt_int32_t       required = -1;
    EXPECT_EQ(kt_pmsg_cnv_required_1(nullptr, &required), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_cnv_required_1(&header, nullptr), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(header.kt_pmsg_length, 0x64000000u);
}
