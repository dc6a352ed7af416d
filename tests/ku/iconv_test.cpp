// SPDX-License-Identifier: MIT
// String conversion between a code set and the table encoding.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "kt_ku.h"
#include "support/faults.h"

namespace
{

class handle
{
  public:
    handle(const char * p_codeset, kt_int32_t flags) { EXPECT_EQ(ku_iconv_open_1(p_codeset, flags, &p_), 0); }
    ~handle() { EXPECT_EQ(ku_iconv_close_1(p_), 0); }
    handle(const handle &)             = delete;
    handle & operator=(const handle &) = delete;
             operator ku_iconv_t *() const { return p_; }

  private:
    ku_iconv_t * p_ = nullptr;
};

struct outcome {
    kt_int32_t  rc;
    std::string text;
    bool        operator==(const outcome &) const = default;
};

std::ostream & operator<<(std::ostream & out, const outcome & o)
{
    return out << o.rc << " \"" << o.text << '"';
}

outcome convert(ku_iconv_t * p_handle, const std::string & input, bool by_terminator = false)
{
    kt_uint32_t      input_size = by_terminator ? 0 : static_cast<kt_uint32_t>(input.size());
    kt_char_ptr_t    p_output   = nullptr;
    kt_uint32_t      size       = 4711;
    const kt_int32_t rc         = ku_iconv_str_1(p_handle, 0, input.c_str(), &input_size, &p_output, &size);
    if (rc != 0) {
        EXPECT_EQ(p_output, nullptr);
        EXPECT_EQ(size, 4711u);
        return {rc, ""};
    }
    EXPECT_EQ(p_output[size], '\0');
    outcome result{0, std::string(p_output, size)};
    std::free(p_output);
    return result;
}

constexpr kt_int32_t to_table   = KU_ICONV_TO_TABLE;
constexpr kt_int32_t from_table = KU_ICONV_FROM_TABLE;

TEST(string_conversion, passes_bytes_through_for_utf8_and_the_c_locales_code_set)
{
    for (const char * p_codeset : {"UTF-8", "utf8", "ANSI_X3.4-1968", "US-ASCII", "C", "POSIX"}) {
        for (const kt_int32_t flags : {0, 1, 8, 9}) {
            const handle h(p_codeset, flags);
            EXPECT_NE(ku_iconv_is_identity_1(h), 0);
            EXPECT_EQ(convert(h, "na\xC3\xAFve"), (outcome{0, "na\xC3\xAFve"}));
            EXPECT_EQ(convert(h, "\xFF\xFE not text"), (outcome{0, "\xFF\xFE not text"}));
        }
    }
}

TEST(string_conversion, goes_both_ways)
{
    const handle to("ISO-8859-1", to_table), from("ISO-8859-1", from_table);
    EXPECT_EQ(ku_iconv_is_identity_1(to), 0);
    EXPECT_EQ(ku_iconv_is_identity_1(from), 0);
    EXPECT_EQ(convert(to, "na\xEFve"), (outcome{0, "na\xC3\xAFve"}));
    EXPECT_EQ(convert(from, "na\xC3\xAFve"), (outcome{0, "na\xEFve"}));
}

TEST(string_conversion, refuses_a_character_without_counterpart)
{
    const handle from("ISO-8859-1", from_table);
    EXPECT_EQ(convert(from, "10 \xE2\x82\xAC"), (outcome{KU_E_NO_COUNTERPART, ""}));
    EXPECT_EQ(convert(from, "\xE2\x80\x9Cquoted\xE2\x80\x9D"), (outcome{KU_E_NO_COUNTERPART, ""}));
    EXPECT_EQ(convert(from, "fine again"), (outcome{0, "fine again"}));
}

TEST(string_conversion, refuses_what_is_not_text_of_the_code_set)
{
    const handle from("ISO-8859-1", from_table);
    EXPECT_EQ(convert(from, "\xFF"), (outcome{KU_E_NO_COUNTERPART, ""}));
    EXPECT_EQ(convert(from, "cut off \xE2\x82"), (outcome{KU_E_NO_COUNTERPART, ""}));
    EXPECT_EQ(convert(from, "and after it"), (outcome{0, "and after it"}));
}

TEST(string_conversion, reads_the_given_size_or_up_to_the_terminator)
{
    const handle utf8("UTF-8", to_table), latin("ISO-8859-1", to_table);
    for (ku_iconv_t * p_handle : {static_cast<ku_iconv_t *>(utf8), static_cast<ku_iconv_t *>(latin)}) {
        const std::string with_zero("a\0b", 3);
        EXPECT_EQ(convert(p_handle, with_zero), (outcome{0, with_zero}));
        EXPECT_EQ(convert(p_handle, with_zero, true), (outcome{0, "a"}));
        EXPECT_EQ(convert(p_handle, ""), (outcome{0, ""}));
    }
}

TEST(string_conversion, makes_room_for_a_result_that_is_longer_than_the_input)
{
    const handle to("ISO-8859-1", to_table);
    std::string  expected;
    for (int i = 0; i < 100000; i++)
        expected += "\xC3\xA4";
    EXPECT_EQ(convert(to, std::string(100000, '\xE4')), (outcome{0, expected}));
}

TEST(string_conversion, brings_a_stateful_code_set_back_to_its_initial_state)
{
    const handle from("ISO-2022-JP", from_table), to("ISO-2022-JP", to_table);
    const char * p_japanese = "\xE6\x97\xA5";
    const auto   encoded    = convert(from, p_japanese);
    EXPECT_EQ(encoded, (outcome{0, "\x1B$BF|\x1B(B"}));
    EXPECT_EQ(convert(to, encoded.text), (outcome{0, p_japanese}));
}

TEST(string_conversion, terminates_a_result_of_wide_units_too)
{
    const handle from("UTF-32LE", from_table);
    EXPECT_EQ(convert(from, "a"), (outcome{0, std::string("a\0\0\0", 4)}));
}

TEST(string_conversion, knows_no_code_set_by_a_strange_name)
{
    ku_iconv_t * p_handle = nullptr;
    EXPECT_EQ(ku_iconv_open_1("no-such-code-set", 0, &p_handle), KU_E_UNKNOWN_CODESET);
    EXPECT_EQ(ku_iconv_open_1("", 0, &p_handle), KU_E_UNKNOWN_CODESET);
    EXPECT_EQ(ku_iconv_open_1("ISO-8859-1//TRANSLIT", 1, &p_handle), KU_E_UNKNOWN_CODESET);
    EXPECT_EQ(ku_iconv_open_1("ISO-8859-1//IGNORE", 1, &p_handle), KU_E_UNKNOWN_CODESET);
    EXPECT_EQ(ku_iconv_open_1(std::string(1000, 'U').c_str(), 0, &p_handle), KU_E_UNKNOWN_CODESET);
    EXPECT_EQ(p_handle, nullptr);
}

TEST(string_conversion, refuses_arguments_that_it_cannot_use)
{
    ku_iconv_t *  p_handle = nullptr;
    kt_uint32_t   size     = 1;
    kt_char_ptr_t p_output = nullptr;
    EXPECT_EQ(ku_iconv_open_1(nullptr, 0, &p_handle), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_open_1("UTF-8", 0, nullptr), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_open_1("UTF-8", 2, &p_handle), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_close_1(nullptr), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_str_1(nullptr, 1, "a", &size, &p_output, &size), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_str_1(nullptr, 0, nullptr, &size, &p_output, &size), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_str_1(nullptr, 0, "a", nullptr, &p_output, &size), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_str_1(nullptr, 0, "a", &size, nullptr, &size), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(ku_iconv_str_1(nullptr, 0, "a", &size, &p_output, nullptr), KU_E_INVALID_ARGUMENT);
    EXPECT_EQ(p_output, nullptr);
}

TEST(string_conversion, without_a_handle_passes_bytes_through)
{
    EXPECT_EQ(ku_iconv_is_identity_1(nullptr), 1);
    EXPECT_EQ(convert(nullptr, "\xFFplain"), (outcome{0, "\xFFplain"}));
}

TEST(string_conversion, asks_that_utf8_be_left_as_it_is)
{
    EXPECT_EQ(ku_utf8_is_not_modified_1(), 1);
}

TEST(string_conversion, reports_each_failing_allocation)
{
    for (const char * p_codeset : {"UTF-8", "ISO-8859-1"}) {
        kt_test::fault_scope scope;
        ku_iconv_t *         p_handle = nullptr;
        kt_test::fail_call(kt_test::call::allocation, 1, ENOMEM);
        EXPECT_EQ(ku_iconv_open_1(p_codeset, 0, &p_handle), KU_E_NO_MEMORY);
        EXPECT_EQ(p_handle, nullptr);

        const handle  h(p_codeset, from_table);
        kt_char_ptr_t p_output = nullptr;
        kt_uint32_t   size     = 3;
        kt_test::fail_call(kt_test::call::allocation, 1, ENOMEM);
        EXPECT_EQ(ku_iconv_str_1(h, 0, "abc", &size, &p_output, &size), KU_E_NO_MEMORY);
        EXPECT_EQ(p_output, nullptr);
        EXPECT_EQ(convert(h, "abc"), (outcome{0, "abc"}));
    }
}

TEST(string_conversion, reports_a_failure_to_grow_in_mid_conversion)
{
    // Every character takes four units, so the first room is too small.
    const handle         from("UTF-32LE", from_table);
    const std::string    input(1000, 'x');
    kt_test::fault_scope scope;
    kt_test::fail_call(kt_test::call::allocation, 2, ENOMEM);
    kt_char_ptr_t    p_output = nullptr;
    kt_uint32_t      size     = 1000;
    const kt_int32_t rc       = ku_iconv_str_1(from, 0, input.c_str(), &size, &p_output, &size);
    const bool       failed   = kt_test::failed_as_asked(kt_test::call::allocation);
    kt_test::reset_calls();
    EXPECT_TRUE(failed);
    EXPECT_EQ(rc, KU_E_NO_MEMORY);
    EXPECT_EQ(convert(from, "x").rc, 0);
}

TEST(threads_string_conversion, several_threads_use_one_handle)
{
    const handle             from("ISO-2022-JP", from_table);
    std::vector<std::thread> threads;
    for (int i = 0; i < 12; i++) {
        threads.emplace_back([&from, i] {
            for (int round = 0; round < 300; round++) {
                if ((i + round) % 3 == 0)
                    EXPECT_EQ(convert(from, "\xE6\x97\xA5"), (outcome{0, "\x1B$BF|\x1B(B"}));
                else if ((i + round) % 3 == 1)
                    EXPECT_EQ(convert(from, "plain"), (outcome{0, "plain"}));
                else
                    EXPECT_EQ(convert(from, "\xE6\x97\xA5\xFF").rc, KU_E_NO_COUNTERPART);
            }
        });
    }
    for (std::thread & t : threads)
        t.join();
}

} // namespace
