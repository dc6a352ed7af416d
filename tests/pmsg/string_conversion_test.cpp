// SPDX-License-Identifier: MIT
// string_conversion: strings on their way into and out of stored values through a conversion handle. The client speaks
// ISO-8859-1 here, where an "e" with an acute accent is the byte E9; the table's UTF-8 has C3 A9 for it.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>

#include "pmsg/value_kit.h"
#include "support/faults.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

constexpr kt_pmsg_len_t no_bound = 0xFFFFFFFF;

class handle
{
  public:
    explicit handle(kt_int32_t flags, const char * p_codeset = "ISO-8859-1")
    {
        EXPECT_EQ(ku_iconv_open_1(p_codeset, flags, &p_handle_), 0);
    }
    ~handle() { ku_iconv_close_1(p_handle_); }
    handle(const handle &)             = delete;
    handle & operator=(const handle &) = delete;
             operator ku_iconv_t *() const { return p_handle_; }

  private:
    ku_iconv_t * p_handle_ = nullptr;
};

// All forms in which strings occur, in the client's code set and in the table's.
struct pair_of {
    model client;
    model table;
};

model with_texts(const std::string & text1, const std::string & text2, unsigned form)
{
    switch (form) {
    case 0:
        return a_string(text1);
    case 1:
        return an_array(KT_CHAR_PTR_ARRAY, {a_string(text1), a_string("plain"), a_string(""), a_string(text2)});
    case 2:
        return structured({a_number(KT_INT32, 5), a_string(text1), a_string(text2)});
    default:
        return an_array(KT_SD_PTR_ARRAY,
                        {structured({an_array(KT_CHAR_PTR_ARRAY, {a_string(text2)}), a_binary("\xe9")}),
                         structured({structured({a_string(text1)}), a_string(text2)})});
    }
}
constexpr unsigned forms = 4;

std::vector<pair_of> pairs()
{
    std::vector<pair_of> result;
    for (unsigned form = 0; form < forms; ++form)
        result.push_back({with_texts("caf\xe9", "\xfc\xf6\xe4 and more", form),
                          with_texts("caf\xc3\xa9", "\xc3\xbc\xc3\xb6\xc3\xa4 and more", form)});
    return result;
}

struct room {
    std::array<std::uint8_t, 8> slot;
    octets                      area;
    kt_uint32_t                 offset = 0;

    explicit room(std::size_t bytes) : area(bytes, 0xEE) { slot.fill(0xEE); }
    bool operator==(const room &) const = default;

    kt_int32_t build(const model & m, ku_iconv_t * p_handle)
    {
        client_values    clients;
        const kt_value_t value = clients.make(m);
        return kt_pmsg_build_conv_protocol_value_1(p_handle, 0, m.type, &value, slot.data(), area.data(),
                                                   static_cast<kt_uint32_t>(area.size()), &offset);
    }
};

kt_int32_t read(const stored & s, kt_data_type_t type, ku_iconv_t * p_handle, kt_value_t * p_value)
{
    return kt_pmsg_build_conv_packed_client_value_1(p_handle, 0, type, p_value, s.slot.data(), s.area.data(),
                                                    static_cast<kt_uint32_t>(s.area.size()));
}

} // namespace

TEST(string_conversion, strings_are_built_in_the_tables_encoding_wherever_they_stand)
{
    const handle to_table(KU_ICONV_TO_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        const stored expected = stored_of(p.table);
        room         r(expected.area.size());
        ASSERT_EQ(r.build(p.client, to_table), 0);
        EXPECT_EQ(r.slot, expected.slot);
        EXPECT_EQ(to_hex(r.area), to_hex(expected.area));
        EXPECT_EQ(r.offset, expected.area.size());
    }
}

TEST(string_conversion, room_is_counted_in_converted_bytes_and_a_short_room_is_left_as_it_was)
{
    const handle to_table(KU_ICONV_TO_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        room       r(stored_of(p.table).area.size() - 1); // enough for the unconverted strings
        const room before = r;
        EXPECT_EQ(r.build(p.client, to_table), KT_PMSG_E_NO_ROOM);
        EXPECT_EQ(r, before);
    }
}

TEST(string_conversion, strings_are_read_in_the_clients_code_set_wherever_they_stand)
{
    const handle from_table(KU_ICONV_FROM_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        kt_value_t value;
        ASSERT_EQ(read(stored_of(p.table), p.table.type, from_table, &value), 0);
        EXPECT_EQ(stored_of(model_of(p.client.type, value)), stored_of(p.client));
        std::free(value.ptr_char);
    }
}

TEST(string_conversion, a_string_that_grows_in_reading_has_the_room_it_needs)
{
    // Read as if the table were in ISO-8859-1: each byte above 7F becomes two.
    const handle widening(KU_ICONV_TO_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        kt_value_t value;
        ASSERT_EQ(read(stored_of(p.client), p.client.type, widening, &value), 0);
        EXPECT_EQ(stored_of(model_of(p.client.type, value)), stored_of(p.table));
        std::free(value.ptr_char);
    }
}

TEST(string_conversion, binaries_and_fields_are_never_converted)
{
    const handle to_table(KU_ICONV_TO_TABLE);
    const handle from_table(KU_ICONV_FROM_TABLE);
    const model  text_field = {.type = KT_CHAR_PTR, .text = "\xe9"};
    for (const model & m : {a_binary("\xe9\xfc"), an_sbs({text_field})}) {
        const stored expected = stored_of(m);
        room         r(expected.area.size());
        ASSERT_EQ(r.build(m, to_table), 0);
        EXPECT_EQ(r.area, expected.area);
        kt_value_t value;
        ASSERT_EQ(read(expected, m.type, from_table, &value), 0);
        EXPECT_EQ(stored_of(model_of(m.type, value)), expected);
        std::free(value.ptr_char);
    }
}

TEST(string_conversion, a_character_without_a_counterpart_gives_2_and_nothing_is_written)
{
    const handle to_table(KU_ICONV_TO_TABLE, "EUC-JP");
    for (unsigned form = 0; form < forms; ++form) {
        SCOPED_TRACE(form);
        room       r(1000);
        const room before = r;
        EXPECT_EQ(r.build(with_texts("good", "bad \xff", form), to_table), form == 0 ? 0 : KT_PMSG_E_CONVERSION);
        if (form != 0) {
            EXPECT_EQ(r, before);
        }
    }
}

TEST(string_conversion, a_stored_character_without_a_counterpart_gives_2_and_no_value)
{
    const handle from_table(KU_ICONV_FROM_TABLE);
    for (unsigned form = 0; form < forms; ++form) {
        SCOPED_TRACE(form);
        kt_value_t value = uint64(0xEEEEEEEEEEEEEEEE);
        // The euro sign, which ISO-8859-1 hasn't, and bytes that are not UTF-8.
        for (const char * p_bad : {"\xe2\x82\xac", "\xff\xfe"}) {
            EXPECT_EQ(
                read(stored_of(with_texts(p_bad, p_bad, form)), with_texts("", "", form).type, from_table, &value),
                KT_PMSG_E_CONVERSION);
            EXPECT_EQ(value.val_uint64, 0xEEEEEEEEEEEEEEEE);
        }
    }
}

TEST(string_conversion, a_code_set_with_zero_bytes_in_its_characters_is_refused_with_2)
{
    const handle from_table(KU_ICONV_FROM_TABLE, "UTF-16LE");
    for (unsigned form = 0; form < forms; ++form) {
        kt_value_t value = uint64(0xEEEEEEEEEEEEEEEE);
        EXPECT_EQ(read(stored_of(with_texts("a", "b", form)), with_texts("", "", form).type, from_table, &value),
                  KT_PMSG_E_CONVERSION);
        EXPECT_EQ(value.val_uint64, 0xEEEEEEEEEEEEEEEE);
    }
}

TEST(string_conversion, a_handle_that_changes_nothing_passes_all_bytes_through)
{
    const handle to_table(KU_ICONV_TO_TABLE, "UTF-8");
    const handle from_table(KU_ICONV_FROM_TABLE, "UTF-8");
    for (unsigned form = 0; form < forms; ++form) {
        const model  m        = with_texts("\xff\xfe", "\xc3\xa9", form);
        const stored expected = stored_of(m);
        room         r(expected.area.size());
        ASSERT_EQ(r.build(m, to_table), 0);
        EXPECT_EQ(r.area, expected.area);
        kt_value_t value;
        ASSERT_EQ(read(expected, m.type, from_table, &value), 0);
        EXPECT_EQ(stored_of(model_of(m.type, value)), expected);
        std::free(value.ptr_char);
    }
}

TEST(string_conversion, each_allocation_that_fails_in_building_gives_3_and_nothing_is_written)
{
    const handle to_table(KU_ICONV_TO_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        client_values    clients;
        const kt_value_t value = clients.make(p.client);
        kt_int32_t       rc    = KT_PMSG_E_NO_MEMORY;
        unsigned         nth   = 0;
        while (rc == KT_PMSG_E_NO_MEMORY && nth < 100) {
            room              r(1000);
            const room        before = r;
            const fault_scope scope;
            fail_call(call::allocation, ++nth, ENOMEM);
            rc = kt_pmsg_build_conv_protocol_value_1(to_table, 0, p.client.type, &value, r.slot.data(), r.area.data(),
                                                     1000, &r.offset);
            reset_calls();
            if (rc != 0) {
                EXPECT_EQ(rc, KT_PMSG_E_NO_MEMORY);
                EXPECT_EQ(r, before);
            }
        }
        EXPECT_EQ(rc, 0);
        EXPECT_GT(nth, 1u);
    }
}

TEST(string_conversion, each_allocation_that_fails_in_reading_gives_3_and_leaves_nothing)
{
    const handle from_table(KU_ICONV_FROM_TABLE);
    for (const pair_of & p : pairs()) {
        SCOPED_TRACE(p.client.type);
        const stored s   = stored_of(p.table);
        kt_int32_t   rc  = KT_PMSG_E_NO_MEMORY;
        unsigned     nth = 0;
        while (rc == KT_PMSG_E_NO_MEMORY && nth < 100) {
            kt_value_t        value = uint64(0xEEEEEEEEEEEEEEEE);
            const fault_scope scope;
            fail_call(call::allocation, ++nth, ENOMEM);
            rc = read(s, p.table.type, from_table, &value);
            reset_calls();
            if (rc == 0) {
                EXPECT_EQ(stored_of(model_of(p.client.type, value)), stored_of(p.client));
                std::free(value.ptr_char);
            } else {
                EXPECT_EQ(rc, KT_PMSG_E_NO_MEMORY);
                EXPECT_EQ(value.val_uint64, 0xEEEEEEEEEEEEEEEE);
            }
        }
        EXPECT_EQ(rc, 0);
        EXPECT_GT(nth, 1u);
    }
}

TEST(string_conversion, a_thousand_strings_of_one_value_are_converted_in_their_order)
{
    const handle to_table(KU_ICONV_TO_TABLE);
    model        client = an_array(KT_CHAR_PTR_ARRAY, {});
    model        table  = an_array(KT_CHAR_PTR_ARRAY, {});
    for (unsigned i = 0; i < 1000; ++i) {
        client.elements.push_back(a_string(std::to_string(i) + "\xe9"));
        table.elements.push_back(a_string(std::to_string(i) + "\xc3\xa9"));
    }
    const stored expected = stored_of(table);
    room         r(expected.area.size());
    ASSERT_EQ(r.build(client, to_table), 0);
    EXPECT_TRUE(r.area == expected.area);
}
