// SPDX-License-Identifier: MIT
// Criteria: how a format with "$" variables becomes text, and what a compiled expression asks about names.
#include <clocale>
#include <cmath>
#include <cstdarg>
#include <limits>

#include "rows/rg_i_criteria.h"
#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

struct rendering_t {
    kt_int32_t  rc;
    std::string text;
};

rendering_t render(const char * p_format, ...)
{
    va_list ap;
    va_start(ap, p_format);
    kt_char_ptr_t    p_text = nullptr;
    const kt_int32_t rc     = rg_i_select_printf(&p_text, text(p_format), ap);
    va_end(ap);
    rendering_t result{rc, rc == 0 ? p_text : ""};
    std::free(p_text);
    return result;
}

TEST(the_variables_of_criteria, take_integers_of_each_kind)
{
    EXPECT_EQ(render("$i $I", -5, INT32_MIN).text, "-5 -2147483648");
    EXPECT_EQ(render("$l $L", std::int64_t{-5}, INT64_MIN).text, "-5 -9223372036854775808");
    EXPECT_EQ(render("$ui $Ui $uI $UI", 1u, 2u, 3u, UINT32_MAX).text, "1 2 3 4294967295");
    EXPECT_EQ(render("$ul $Ul $uL $UL", std::uint64_t{1}, std::uint64_t{2}, std::uint64_t{3}, UINT64_MAX).text,
              "1 2 3 18446744073709551615");
}

TEST(the_variables_of_criteria, take_doubles_in_two_forms)
{
    EXPECT_EQ(render("$f $F", 0.5, -2.0).text, "0.500000 -2.000000");
    EXPECT_EQ(render("$d $D", 0.5, 1e100).text, "0.5 1e+100");
    EXPECT_EQ(render("$f $d", INFINITY, -INFINITY).text, "inf -inf");
}

TEST(the_variables_of_criteria, render_the_largest_double_in_full)
{
    const std::string text = render("$f", -std::numeric_limits<double>::max()).text;
    EXPECT_EQ(text.size(), 1u + 309 + 7);
    EXPECT_EQ(std::strtod(text.c_str(), nullptr), -std::numeric_limits<double>::max());
}

TEST(the_variables_of_criteria, leave_the_locale_as_it_is)
{
    const std::string former = std::setlocale(LC_ALL, nullptr);
    EXPECT_EQ(render("$f", 1.5).text, "1.500000");
    EXPECT_EQ(former, std::setlocale(LC_ALL, nullptr));
}

TEST(the_variables_of_criteria, put_strings_in_quotes_with_nothing_escaped)
{
    EXPECT_EQ(render("name == $s", "abc").text, "name == \"abc\"");
    EXPECT_EQ(render("$S$s", "", "x").text, "\"\"\"x\"");
    EXPECT_EQ(render("$s", "a\" || \"1\" == \"1").text, "\"a\" || \"1\" == \"1\"");
    EXPECT_EQ(render("$s", "$i").text, "\"$i\"") << "and a variable in it is none";
}

TEST(the_variables_of_criteria, render_binaries_as_hexadecimal_digits)
{
    alignas(kt_binary_t) char room[16]{};
    auto * const              p_binary = reinterpret_cast<kt_binary_t *>(room);
    p_binary->length                   = 0;
    EXPECT_EQ(render("$b", p_binary).text, "\"0x\"");
    p_binary->length = 4;
    std::memcpy(room + offsetof(kt_binary_t, data), "\x00\x0a\x80\xff", 4);
    EXPECT_EQ(render("$B", p_binary).text, "\"0x000a80ff\"");
}

TEST(the_variables_of_criteria, render_resource_handles_as_six_words)
{
    const kt_resource_handle_t handle{0xABCD0102, {1, 0xFFFFFFFF, 3, 0x10}};
    for (const char * p_format : {"$rh", "$rH", "$Rh", "$RH"}) {
        const std::string text = render(p_format, &handle).text;
        EXPECT_EQ(text, "\"0x0102 0xabcd 0x00000001 0xffffffff 0x00000003 0x00000010\"");
        EXPECT_EQ(text.size(), 59u);
    }
}

TEST(the_variables_of_criteria, let_quotes_through_so_that_strings_can_have_escapes)
{
    EXPECT_EQ(render("$\"a\\n\" $'b'").text, "$\"a\\n\" $'b'");
    EXPECT_EQ(render("$\"$i\"", 5).text, "$\"5\"") << "the scan goes on behind the quote";
}

TEST(the_variables_of_criteria, of_another_kind_are_refused_with_the_whole_format_in_the_message)
{
    for (const char * p_format : {"$x", "$$", "$", "a $", "$ i", "$1", "$\xe4", "$\xff", "$u", "$U ", "$ux", "$U$i",
                                  "$R", "$r ", "$ri", "$Rs", "a == $i $q"}) {
        EXPECT_EQ(render(p_format, 1, 2).rc, RG_E_INVALID_VARIABLE_TYPE) << p_format;
        EXPECT_EQ(error_code(), RG_E_INVALID_VARIABLE_TYPE);
        EXPECT_EQ(error_message_index(), 16);
        EXPECT_NE(error_text().find(std::string("string: ") + p_format), std::string::npos) << error_text();
    }
}

TEST(the_variables_of_criteria, refuse_null_pointers)
{
    for (const char * p_format : {"$s", "$b", "$rh"}) {
        EXPECT_EQ(render(p_format, static_cast<void *>(nullptr)).rc, RG_E_NULL_POINTER) << p_format;
        EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    }
}

TEST(a_format_without_variables, passes_through_unchanged)
{
    EXPECT_EQ(render("").text, "");
    EXPECT_EQ(render("a == 1 && b like \"%x\"").text, "a == 1 && b like \"%x\"");
    EXPECT_EQ(render("\xc3\xa4 %d %s").text, "\xc3\xa4 %d %s");
}

// How many times the text grew, counted by its allocations.
unsigned allocations_for(const std::string & format)
{
    kt_char_ptr_t     p_format = text(format);
    const fault_scope faults;
    const rendering_t result = [&](int unused, ...) {
        va_list ap;
        va_start(ap, unused);
        kt_char_ptr_t    p_text = nullptr;
        const kt_int32_t rc     = rg_i_select_printf(&p_text, p_format, ap);
        va_end(ap);
        std::free(p_text);
        return rendering_t{rc, {}};
    }(0);
    EXPECT_EQ(result.rc, 0);
    return calls_made(call::allocation);
}

TEST(a_format_without_variables, of_4095_characters_fits_the_first_allocation)
{
    EXPECT_EQ(allocations_for(std::string(4095, 'x')), 1u);
    EXPECT_EQ(allocations_for(std::string(4096, 'x')), 2u);
    EXPECT_EQ(render(std::string(100'000, 'x').c_str()).text, std::string(100'000, 'x'));
}

TEST(the_text_of_criteria, grows_in_steps_and_keeps_its_cursor)
{
    kt_char_ptr_t p_text  = static_cast<kt_char_ptr_t>(std::malloc(4096));
    kt_char_ptr_t p_to    = p_text;
    kt_uint32_t   current = 0;
    kt_uint32_t   maximum = 4096;
    const auto    append  = [&](const char * p_bytes, kt_uint32_t length) {
        return rg_i_append_buffer_to_result(&current, &maximum, length, &p_text, &p_to, p_bytes);
    };
    ASSERT_EQ(append("abc", 3), 0);
    EXPECT_EQ(current, 3u);
    EXPECT_EQ(p_to, p_text + 3);
    ASSERT_EQ(append(nullptr, 4093), 0);
    EXPECT_EQ(maximum, 4096u);
    ASSERT_EQ(append(nullptr, 4094), 0);
    EXPECT_EQ(maximum, 8192u);
    EXPECT_EQ(current, 3u) << "room is made, nothing is appended";
    ASSERT_EQ(append(nullptr, 20'000), 0);
    EXPECT_EQ(maximum, 20'480u);
    EXPECT_EQ(p_to, p_text + 3);
    EXPECT_EQ(std::memcmp(p_text, "abc", 3), 0);
    const fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(append(nullptr, 50'000), RG_E_NO_MEMORY);
    EXPECT_EQ(p_text, nullptr);
}

TEST(the_text_of_criteria, may_run_out_of_memory_anywhere)
{
    kt_char_ptr_t format = text("$s" + std::string(5000, 'x') + "$i");
    kt_char_ptr_t value  = text(std::string(10'000, 'y'));
    for (unsigned nth = 1; nth <= 4; ++nth) {
        const fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        const auto run = [&](int unused, ...) {
            va_list ap;
            va_start(ap, unused);
            kt_char_ptr_t    p_text = nullptr;
            const kt_int32_t rc     = rg_i_select_printf(&p_text, format, ap);
            va_end(ap);
            std::free(p_text);
            return rc;
        };
        const kt_int32_t rc = run(0, value, 7);
        EXPECT_EQ(rc, failed_as_asked(call::allocation) ? RG_E_NO_MEMORY : 0);
    }
}

// ---- Names ----

struct the_names_of_criteria : ::testing::Test, registry_of_tables {
    the_names_of_criteria()
    {
        std::memset(room_, 0, sizeof room_);
        auto * const p_definition      = reinterpret_cast<rg_sd_def_t *>(room_);
        p_definition->number_of_fields = 2;
        const rg_field_def_t fields[2]{{KT_INT32, text("first")}, {KT_CHAR_PTR, text("second")}};
        std::memcpy(room_ + offsetof(rg_sd_def_t, fields), fields, sizeof fields);
        rg_column_t sd  = column("sd", KT_SD_PTR, RG_STANDARD, null_value());
        sd.sd_defn      = p_definition;
        rg_column_t sds = column("sds", KT_SD_PTR_ARRAY, RG_STANDARD, null_value());
        sds.sd_defn     = p_definition;
        table_ = make({false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY), column("s", KT_CHAR_PTR), sd, sds});
    }
    kt_int32_t ask(const char * p_name, kt_uint32_t parent_id)
    {
        answer_ = {99, 99};
        return rg_i_validate_column_callback(table_, text(p_name), 12345, parent_id, &answer_);
    }

    rg_opaque_handle_t table_ = nullptr;
    ku_validate_data_t answer_{};

  private:
    alignas(rg_sd_def_t) char room_[offsetof(rg_sd_def_t, fields) + 2 * sizeof(rg_field_def_t)];
};

TEST_F(the_names_of_criteria, are_those_of_the_columns_at_the_top_level)
{
    EXPECT_EQ(ask("id", 0xFFFFFFFF), 0);
    EXPECT_EQ(answer_.id, 0u);
    EXPECT_EQ(answer_.type, static_cast<kt_data_type_t>(KT_UINT32));
    EXPECT_EQ(ask("sds", 0xFFFFFFFF), 0);
    EXPECT_EQ(answer_.id, 3u);
    EXPECT_EQ(answer_.type, static_cast<kt_data_type_t>(KT_SD_PTR_ARRAY));
    for (const char * p_name : {"", "Id", "first", "i", "idx"}) {
        EXPECT_EQ(ask(p_name, 0xFFFFFFFF), -1) << p_name;
        EXPECT_EQ(answer_.id, 99u);
    }
}

TEST_F(the_names_of_criteria, are_those_of_the_fields_below_structured_data)
{
    for (const kt_uint32_t parent : {2u, 3u}) {
        EXPECT_EQ(ask("first", parent), 0);
        EXPECT_EQ(answer_.id, 0u);
        EXPECT_EQ(answer_.type, static_cast<kt_data_type_t>(KT_INT32));
        EXPECT_EQ(ask("second", parent), 0);
        EXPECT_EQ(answer_.id, 1u);
        EXPECT_EQ(answer_.type, static_cast<kt_data_type_t>(KT_CHAR_PTR));
        EXPECT_EQ(ask("third", parent), -1);
        EXPECT_EQ(ask("id", parent), -1);
    }
}

TEST_F(the_names_of_criteria, are_not_looked_for_past_the_columns_nor_in_a_column_without_a_definition)
{
    EXPECT_EQ(ask("first", 4), -1);
    EXPECT_EQ(ask("first", 0xFFFFFFFE), -1);
    EXPECT_EQ(ask("first", 0), -1);
    EXPECT_EQ(ask("first", 1), -1);
}

TEST_F(the_names_of_criteria, work_in_an_expression)
{
    kt_structured_data_t sd{1, 0, {{KT_INT32, 0, int32(5)}}};
    kt_value_t           value{};
    value.ptr_sd = &sd;
    ASSERT_EQ(add_row(table_, {{"id", uint32(1)}, {"sd", value}}), 0);
    ASSERT_EQ(add_row(table_, {{"id", uint32(2)}}), 0);
    ASSERT_EQ(rg_delete_rows_1(table_, text("sd.first == 5")), 0);
    EXPECT_EQ(state_of(table_, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_NO_ROW));
    EXPECT_EQ(state_of(table_, 1), static_cast<rg_row_state_t>(RG_ROW_STATE_ADDED));
}

TEST_F(the_names_of_criteria, are_converted_from_the_clients_code_set)
{
    ASSERT_EQ(add_row(table_, {{"id", uint32(1)}, {"s", string("\xc3\xa4")}}), 0);
    auto & object = *static_cast<rg_i_tree_t *>(object_of(table_).p_tree);
    ASSERT_EQ(ku_iconv_close_1(object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_TO_TABLE, &object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(rg_delete_rows_1(table_, text("s == $s"), "\xe4"), 0);
    EXPECT_EQ(object_of(table_).applied_deletions, 1u);
}

TEST_F(the_names_of_criteria, may_stand_in_criteria_of_any_nonsense)
{
    ASSERT_EQ(add_row(table_, {{"id", uint32(1)}}), 0);
    const std::string nonsense[]{"(",
                                 ")",
                                 std::string(100'000, '('),
                                 std::string(1'000'000, 'x'),
                                 std::string(2'000'000, ' ') + "id",
                                 "id == \"",
                                 "\xff\xfe\xfd",
                                 "id == 1 " + std::string(100'000, '!'),
                                 "s.first == 1",
                                 "sd == 1"};
    for (const std::string & criteria : nonsense) {
        EXPECT_EQ(rg_delete_rows_1(table_, text(criteria)), RG_E_LIBRARY_CALL) << criteria.substr(0, 20);
        EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
    }
    EXPECT_EQ(object_of(table_).applied_deletions, 0u);
}

} // namespace

} // namespace kt_test
