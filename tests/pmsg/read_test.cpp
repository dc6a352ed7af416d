// SPDX-License-Identifier: MIT
// read: making client values from stored ones: round trips, one block, bounds, and items that are damaged.
#include <gtest/gtest.h>

#include <malloc.h>

#include <cerrno>
#include <cstdlib>

#include "pmsg/value_kit.h"
#include "support/faults.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

constexpr kt_pmsg_len_t no_bound = 0xFFFFFFFF;

kt_int32_t read(const stored & s, kt_data_type_t type, kt_value_t * p_value, kt_pmsg_len_t bound)
{
    return kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, type, p_value, s.slot.data(), s.area.data(), bound);
}

kt_value_t untouched()
{
    return uint64(0xEEEEEEEEEEEEEEEE);
}

// Reads and walks the value, and says what came of it.
kt_int32_t read_and_release(const stored & s, kt_data_type_t type, kt_pmsg_len_t bound)
{
    kt_value_t       value = untouched();
    const kt_int32_t rc    = read(s, type, &value, bound);
    if (rc != 0) {
        EXPECT_EQ(value.val_uint64, untouched().val_uint64);
        return rc;
    }
    static_cast<void>(item_of(model_of(type, value), machine::here));
    if (!is_number(type))
        std::free(value.ptr_char);
    return 0;
}

// Every record lies in the block, at an address that suits its type.
void expect_inside(kt_data_type_t type, const kt_value_t & value, const char * p_block, std::size_t length)
{
    if (is_number(type))
        return;
    const char * const p_record  = value.ptr_char;
    const std::size_t  alignment = type == KT_CHAR_PTR                                                         ? 1
                                   : type == KT_BINARY_PTR || type == KT_SBS_PTR || type == KT_RSRC_HANDLE_PTR ? 4
                                                                                                               : 8;
    ASSERT_GE(p_record, p_block);
    ASSERT_LT(p_record, p_block + length);
    ASSERT_EQ(reinterpret_cast<std::uintptr_t>(p_record) % alignment, 0u);
    if (type == KT_SD_PTR)
        for (kt_uint32_t i = 0; i < value.ptr_sd->element_count; ++i)
            expect_inside(value.ptr_sd->elements[i].data_type, value.ptr_sd->elements[i].value, p_block, length);
    if (type >= KT_CHAR_PTR_ARRAY)
        for (kt_uint32_t i = 0; i < value.ptr_array->element_count; ++i)
            expect_inside(type - (KT_INT32_ARRAY - KT_INT32), value.ptr_array->elements[i], p_block, length);
}

// A little builder of items that no honest writer makes.
struct raw_item {
    octets bytes;
    explicit raw_item(std::initializer_list<kt_uint32_t> words)
    {
        for (const kt_uint32_t word : words)
            append(bytes, word, machine::here);
    }
    raw_item & text(const std::string & s)
    {
        bytes.insert(bytes.end(), s.begin(), s.end());
        return *this;
    }
    kt_int32_t read_as(kt_data_type_t type) const
    {
        stored s;
        octets slot;
        append(slot, kt_uint32_t{0}, machine::here);
        append(slot, static_cast<kt_uint32_t>(bytes.size()), machine::here);
        std::copy(slot.begin(), slot.end(), s.slot.begin());
        s.area = bytes;
        return read_and_release(s, type, static_cast<kt_uint32_t>(bytes.size()));
    }
};

} // namespace

TEST(reading, what_was_built_comes_back)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        const stored s     = stored_of(m);
        kt_value_t   value = untouched();
        ASSERT_EQ(read(s, m.type, &value, static_cast<kt_uint32_t>(s.area.size())), 0);
        EXPECT_EQ(stored_of(model_of(m.type, value)), s);
        if (!is_number(m.type))
            std::free(value.ptr_char);
    }
}

TEST(reading, a_bound_of_all_ones_leaves_the_anchors_as_the_bounds)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        EXPECT_EQ(read_and_release(stored_of(m, machine::here, 5), m.type, no_bound), 0);
    }
}

TEST(reading, items_and_slots_may_lie_at_any_address)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        for (kt_uint32_t offset = 1; offset < 8; ++offset) {
            const stored s     = stored_of(m, machine::here, offset);
            kt_value_t   value = untouched();
            octets       slots(offset);
            slots.insert(slots.end(), s.slot.begin(), s.slot.end());
            ASSERT_EQ(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, m.type, &value, slots.data() + offset,
                                                               s.area.data(), static_cast<kt_uint32_t>(s.area.size())),
                      0);
            EXPECT_EQ(stored_of(model_of(m.type, value), machine::here, offset), s);
            if (!is_number(m.type))
                std::free(value.ptr_char);
        }
    }
}

TEST(reading, a_value_is_one_block_of_its_own_with_every_record_aligned)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue;
        const fault_scope scope;
        stored            s     = stored_of(m, machine::here, 3);
        kt_value_t        value = untouched();
        const unsigned    made  = calls_made(call::allocation);
        ASSERT_EQ(read(s, m.type, &value, no_bound), 0);
        EXPECT_EQ(calls_made(call::allocation), made + 1);
        expect_inside(m.type, value, value.ptr_char, malloc_usable_size(value.ptr_char));
        // The item may go, and the value stays.
        s.area.assign(s.area.size(), 0);
        EXPECT_EQ(stored_of(model_of(m.type, value)), stored_of(m));
        std::free(value.ptr_char);
    }
}

TEST(reading, a_number_needs_no_indirect_data_and_no_memory)
{
    const fault_scope scope;
    fail_call(call::allocation, 1, ENOMEM, for_good);
    kt_value_t value = untouched();
    EXPECT_EQ(kt_pmsg_build_conv_packed_client_value_1(
                  nullptr, 0, KT_INT32, &value, stored_of(a_number(KT_INT32, 0xFFFFFFF9)).slot.data(), nullptr, 0),
              0);
    EXPECT_EQ(value.val_int32, -7);
}

TEST(reading, the_other_half_of_a_32_bit_number_comes_out_as_zero)
{
    stored     s     = {{1, 2, 3, 4, 5, 6, 7, 8}, {}};
    kt_value_t value = untouched();
    ASSERT_EQ(read(s, KT_UINT32, &value, 0), 0);
    kt_value_t expected = uint64(0);
    std::memcpy(&expected, s.slot.data(), 4);
    EXPECT_EQ(value.val_uint64, expected.val_uint64);

    octets item;
    for (const kt_uint32_t word : {2u, 0x77777777u, 5u, 0x88888888u, 6u, 0x99999999u})
        append(item, word, machine::here);
    s      = stored_of(numbers(KT_UINT32_ARRAY, {5, 6}));
    s.area = item;
    ASSERT_EQ(read(s, KT_UINT32_ARRAY, &value, 24), 0);
    EXPECT_EQ(value.ptr_array->pad, 0u);
    EXPECT_EQ(std::memcmp(&value.ptr_array->elements[0], stored_of(a_number(KT_UINT32, 5)).slot.data(), 8), 0);
    std::free(value.ptr_array);
}

TEST(reading, a_reader_that_takes_a_32_bit_zero_for_a_pointer_finds_null)
{
    octets item; // structured data of one KT_UINT32 0, with other bytes in the half that is left over
    for (const kt_uint32_t word : {1u, 0u, 3u, 0u, 0u, 0xDEADBEEFu})
        append(item, word, machine::here);
    stored s         = stored_of(structured({a_number(KT_UINT32, 0)}));
    s.area           = item;
    kt_value_t value = untouched();
    ASSERT_EQ(read(s, KT_SD_PTR, &value, 24), 0);
    EXPECT_EQ(value.ptr_sd->elements[0].value.ptr_sd, nullptr);
    std::free(value.ptr_sd);
}

TEST(reading, an_empty_record_has_the_room_of_its_whole_type)
{
    for (const kt_data_type_t type : {KT_BINARY_PTR, KT_SBS_PTR, KT_SD_PTR, KT_INT64_ARRAY}) {
        SCOPED_TRACE(type);
        const stored s     = stored_of({.type = static_cast<kt_data_type_t>(type)});
        kt_value_t   value = untouched();
        ASSERT_EQ(read(s, static_cast<kt_data_type_t>(type), &value, no_bound), 0);
        const octets      zeros(sizeof(kt_structured_data_t));
        const std::size_t length = type == KT_BINARY_PTR ? sizeof(kt_binary_t)
                                   : type == KT_SBS_PTR  ? sizeof(kt_sbs_t)
                                   : type == KT_SD_PTR   ? sizeof(kt_structured_data_t)
                                                         : sizeof(kt_array_t);
        EXPECT_EQ(std::memcmp(value.ptr_char, zeros.data(), length), 0);
        std::free(value.ptr_char);
    }
}

// A row on the wire is the image of its record, whose length word counts the header: the item reaches 4 bytes beyond
// the record.
TEST(reading, a_packed_row_is_a_binary_whose_item_is_4_bytes_longer_than_its_length_word)
{
    std::string record("0123456789012345678901234567890123456789012", 43 - 4); // behind the length word
    record += "tail";                                                          // what followed it in its buffer
    const model  rows = an_array(KT_BINARY_PTR_ARRAY, {a_binary(record)});
    const stored s    = stored_of(rows);
    EXPECT_EQ(s.area.size(), 16u + 4 + 43);
    kt_value_t value = untouched();
    ASSERT_EQ(read(s, KT_BINARY_PTR_ARRAY, &value, static_cast<kt_uint32_t>(s.area.size())), 0);
    EXPECT_EQ(value.ptr_array->elements[0].ptr_binary->length, 43u);
    EXPECT_EQ(std::memcmp(value.ptr_array->elements[0].ptr_binary->data, record.data(), 43), 0);
    std::free(value.ptr_array);
}

TEST(reading, each_allocation_that_fails_gives_3_and_leaves_nothing)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue;
        const fault_scope scope;
        const stored      s     = stored_of(m);
        kt_value_t        value = untouched();
        fail_call(call::allocation, 1, ENOMEM);
        EXPECT_EQ(read(s, m.type, &value, no_bound), KT_PMSG_E_NO_MEMORY);
        EXPECT_EQ(value.val_uint64, untouched().val_uint64);
        EXPECT_EQ(read_and_release(s, m.type, no_bound), 0);
    }
}

TEST(reading, a_type_that_is_none_gives_1)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 0xFFFFFFFFu})
        EXPECT_EQ(read_and_release(stored_of(a_string("x")), type, no_bound), KT_PMSG_E_UNSUPPORTED_TYPE);
}

TEST(reading, an_element_of_no_type_gives_1)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 0xFFFFFFFFu})
        EXPECT_EQ(raw_item({1, 0, type, 0, 0, 0}).read_as(KT_SD_PTR), KT_PMSG_E_UNSUPPORTED_TYPE);
}

TEST(reading, missing_arguments_give_4)
{
    const stored s     = stored_of(a_string("x"));
    kt_value_t   value = untouched();
    EXPECT_EQ(
        kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, KT_CHAR_PTR, nullptr, s.slot.data(), s.area.data(), 2),
        KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, KT_CHAR_PTR, &value, nullptr, s.area.data(), 2),
              KT_PMSG_E_DAMAGED);
    EXPECT_EQ(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, KT_CHAR_PTR, &value, s.slot.data(), nullptr, 2),
              KT_PMSG_E_DAMAGED);
    EXPECT_EQ(value.val_uint64, untouched().val_uint64);
}

// ---- Damage --------------------------------------------------------------------------------------------------------

TEST(reading_damage, every_bound_that_is_too_low_gives_4)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue;
        stored     s    = stored_of(m, machine::here, 2);
        const auto full = static_cast<kt_uint32_t>(s.area.size());
        for (kt_uint32_t bound = 0; bound < full; ++bound) {
            stored cut = s;
            cut.area   = octets(s.area.begin(), s.area.begin() + bound); // a block that ends at the bound
            EXPECT_EQ(read_and_release(cut, m.type, bound), KT_PMSG_E_DAMAGED);
        }
    }
}

TEST(reading_damage, every_anchor_that_is_too_short_gives_4)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        if (is_number(m.type))
            continue;
        const stored s = stored_of(m);
        for (kt_uint32_t length = 0; length < s.area.size(); ++length) {
            stored cut = s;
            std::memcpy(cut.slot.data() + 4, &length, 4);
            cut.area = octets(s.area.begin(), s.area.begin() + length);
            EXPECT_EQ(read_and_release(cut, m.type, no_bound), KT_PMSG_E_DAMAGED);
        }
    }
}

TEST(reading_damage, an_anchor_whose_end_would_wrap_gives_4)
{
    stored            s      = stored_of(a_string("abc"));
    const kt_uint32_t offset = 0xFFFFFFFE;
    std::memcpy(s.slot.data(), &offset, 4);
    for (const kt_pmsg_len_t bound : {4u, 0x7FFFFFFFu, no_bound})
        EXPECT_EQ(read_and_release(s, KT_CHAR_PTR, bound), KT_PMSG_E_DAMAGED);
    const kt_uint32_t length = 0xFFFFFFFF;
    std::memcpy(s.slot.data() + 4, &length, 4);
    for (const kt_pmsg_len_t bound : {4u, 0x7FFFFFFFu, no_bound})
        EXPECT_EQ(read_and_release(s, KT_CHAR_PTR, bound), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, any_byte_changed_gives_a_value_or_a_code)
{
    for (const model & m : samples()) {
        SCOPED_TRACE(m.name);
        const stored s      = stored_of(m);
        const auto   length = static_cast<kt_uint32_t>(s.area.size());
        for (std::size_t at = 0; at < 8 + s.area.size(); ++at)
            for (const unsigned change : {0u, 1u, 2u, 3u, 4u}) {
                stored         damaged = s;
                std::uint8_t & octet   = at < 8 ? damaged.slot[at] : damaged.area[at - 8];
                const auto     flipped = static_cast<std::uint8_t>(~octet);
                const auto     up      = static_cast<std::uint8_t>(octet + 1);
                const auto     down    = static_cast<std::uint8_t>(octet - 1);
                octet = change == 0 ? 0 : change == 1 ? 0xFF : change == 2 ? flipped : change == 3 ? up : down;
                const kt_int32_t rc = read_and_release(damaged, m.type, length);
                EXPECT_TRUE(rc == 0 || rc == KT_PMSG_E_DAMAGED || rc == KT_PMSG_E_UNSUPPORTED_TYPE)
                    << rc << " at " << at;
            }
    }
}

TEST(reading_damage, a_string_must_end_in_its_item)
{
    EXPECT_EQ(raw_item({}).text("abc").read_as(KT_CHAR_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({}).read_as(KT_CHAR_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({2, 0, 24, 3, 27, 1}).text(std::string("abc\0", 4)).read_as(KT_CHAR_PTR_ARRAY),
              KT_PMSG_E_DAMAGED); // the next item would end it
}

TEST(reading_damage, a_string_ends_at_its_first_terminator)
{
    stored s  = stored_of(a_string("abcd"));
    s.area[2] = 0;
    kt_value_t value;
    ASSERT_EQ(read(s, KT_CHAR_PTR, &value, 5), 0);
    EXPECT_STREQ(value.ptr_char, "ab");
    std::free(value.ptr_char);
}

TEST(reading_damage, an_inner_length_beyond_the_item_gives_4)
{
    EXPECT_EQ(raw_item({3}).text("abc").read_as(KT_BINARY_PTR), 0);
    EXPECT_EQ(raw_item({4}).text("abc").read_as(KT_BINARY_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({0xFFFFFFFF}).text("abc").read_as(KT_BINARY_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({3}).text("abc").read_as(KT_SBS_PTR), 0);
    EXPECT_EQ(raw_item({4}).text("abc").read_as(KT_SBS_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({0xFFFFFFFF}).text("abc").read_as(KT_SBS_PTR), KT_PMSG_E_DAMAGED); // -1
    EXPECT_EQ(raw_item({0x80000000}).text("abc").read_as(KT_SBS_PTR), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, a_count_beyond_the_item_gives_4)
{
    for (const kt_uint32_t count : {2u, 3u, 0x10000000u, 0x20000000u, 0x1FFFFFFFu, 0x20000001u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(count);
        EXPECT_EQ(raw_item({count, 0, 1, 0}).read_as(KT_INT32_ARRAY), KT_PMSG_E_DAMAGED);
        EXPECT_EQ(raw_item({count, 0, 16, 0}).read_as(KT_CHAR_PTR_ARRAY), KT_PMSG_E_DAMAGED);
        EXPECT_EQ(raw_item({count, 0, KT_UINT32, 0, 1, 0}).read_as(KT_SD_PTR), KT_PMSG_E_DAMAGED);
    }
}

TEST(reading_damage, items_that_overlap_their_head_each_other_or_the_end_give_4)
{
    const auto strings = [](kt_uint32_t offset0, kt_uint32_t length0, kt_uint32_t offset1, kt_uint32_t length1) {
        return raw_item({2, 0, offset0, length0, offset1, length1})
            .text(std::string(8, '\0'))
            .read_as(KT_CHAR_PTR_ARRAY);
    };
    EXPECT_EQ(strings(24, 4, 28, 4), 0);
    EXPECT_EQ(strings(25, 2, 28, 2), 0); // gaps do no harm
    EXPECT_EQ(strings(23, 4, 28, 4), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(0, 4, 28, 4), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(24, 4, 27, 4), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(24, 4, 24, 4), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(28, 4, 24, 4), KT_PMSG_E_DAMAGED); // not in the order of the slots
    EXPECT_EQ(strings(24, 4, 28, 5), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(24, 4, 0xFFFFFFFF, 4), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(strings(24, 0xFFFFFFFF, 28, 4), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, an_item_that_contains_itself_gives_4)
{
    EXPECT_EQ(raw_item({1, 0, KT_SD_PTR, 0, 0, 24}).read_as(KT_SD_PTR), KT_PMSG_E_DAMAGED);
    EXPECT_EQ(raw_item({1, 0, KT_SD_PTR_ARRAY, 0, 0, 24}).read_as(KT_SD_PTR), KT_PMSG_E_DAMAGED);
}

// If elements might share an item, a few hundred bytes could stand for 2 to the power of 30 records.
TEST(reading_damage, elements_that_share_one_item_give_4_at_once)
{
    octets item; // 30 lists of two, each of whose elements names the next list
    for (kt_uint32_t level = 0; level < 30; ++level)
        for (const kt_uint32_t word : {2u, 0u, kt_uint32_t{KT_SD_PTR}, 0u, 40u, (29 - level) * 40,
                                       kt_uint32_t{KT_SD_PTR}, 0u, 40u, (29 - level) * 40})
            append(item, word, machine::here);
    raw_item raw({});
    raw.bytes = item;
    EXPECT_EQ(raw.read_as(KT_SD_PTR), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, items_nested_33_deep_give_4)
{
    EXPECT_EQ(read_and_release(stored_of(nested(32)), KT_SD_PTR, no_bound), 0);
    EXPECT_EQ(read_and_release(stored_of(nested(33)), KT_SD_PTR, no_bound), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, ten_thousand_levels_give_4_at_once)
{
    constexpr kt_uint32_t levels = 10000;
    raw_item              raw({});
    for (kt_uint32_t left = levels; left != 0; --left)
        for (const kt_uint32_t word : {1u, 0u, kt_uint32_t{KT_SD_PTR}, 0u, 24u, (left - 1) * 24})
            append(raw.bytes, word, machine::here);
    EXPECT_EQ(raw.read_as(KT_SD_PTR), KT_PMSG_E_DAMAGED);
}

TEST(reading_damage, a_resource_handle_shorter_than_20_bytes_gives_4)
{
    EXPECT_EQ(raw_item({1, 2, 3, 4, 5}).read_as(KT_RSRC_HANDLE_PTR), 0);
    EXPECT_EQ(raw_item({1, 2, 3, 4}).text("abc").read_as(KT_RSRC_HANDLE_PTR), KT_PMSG_E_DAMAGED);
}
