// SPDX-License-Identifier: MIT
// text: columns, types, values and widths, without a table.
#include "columns.h"
#include "failure.h"
#include "json_text.h"
#include "program.h"
#include "type_detection.h"
#include "utf8.h"
#include "values.h"

namespace
{

TEST(column_text, goes_there_and_back)
{
    for (const std::string text :
         {"id:uint32:key", "name:string:multikey", "load:float64=0.5", "x:int64:protected:invisible:reset=-1",
          "list:string[]", "s:struct(a:int32,b:string[])", "ss:struct(a:binary)[]", "h:handle", "raw:sbs",
          "note:string=a=b:c"})
        EXPECT_EQ(ktrg::column_text(ktrg::parse_column(text)), text);
}

TEST(column_text, that_is_wrong_is_refused)
{
    for (const std::string text :
         {"", "id", ":uint32", "1d:uint32", "a-b:uint32", "id:uint33", "id:uint32:keey", "id:struct", "id:struct()",
          "id:sbs[]", "id:string[][]", "id:binary:key", "id:string[]:key"})
        EXPECT_THROW((void)ktrg::parse_column(text), ktrg::failure) << text;
}

TEST(values, at_the_edges_of_their_types_are_taken_and_beyond_refused)
{
    ktrg::value_arena arena;
    const auto        parse = [&](kt_data_type_t type, const char * p_text) {
        return ktrg::parse_value(type, {}, p_text, arena);
    };
    EXPECT_EQ(parse(KT_INT32, "-2147483648").val_int32, INT32_MIN);
    EXPECT_EQ(parse(KT_UINT32, "4294967295").val_uint32, UINT32_MAX);
    EXPECT_EQ(parse(KT_INT64, "-9223372036854775808").val_int64, INT64_MIN);
    EXPECT_EQ(parse(KT_UINT64, "18446744073709551615").val_uint64, UINT64_MAX);
    EXPECT_EQ(parse(KT_UINT32, "0xff").val_uint32, 255U);
    EXPECT_EQ(parse(KT_FLOAT64, "1e308").val_float64, 1e308);
    const std::vector<std::pair<kt_data_type_t, const char *>> wrong = {
        {KT_INT32, "2147483648"},  {KT_UINT32, "-1"},
        {KT_UINT32, "4294967296"}, {KT_INT64, "9223372036854775808"},
        {KT_UINT64, "-0x1"},       {KT_INT32, ""},
        {KT_INT32, "1 "},          {KT_INT32, "1.0"},
        {KT_INT32, "+-1"},         {KT_FLOAT64, "1e999"},
        {KT_FLOAT64, "one"},       {KT_BINARY_PTR, "0x0"},
        {KT_BINARY_PTR, "0xgg"},   {KT_RSRC_HANDLE_PTR, "0x1 0x2"},
        {KT_INT32_ARRAY, "[1,"},   {KT_INT32_ARRAY, "[1.5]"},
        {KT_INT32_ARRAY, "{}"},    {KT_RSRC_HANDLE_PTR, "0x10000 0x0 0x0 0x0 0x0 0x0"},
    };
    for (const auto & [type, p_text] : wrong)
        EXPECT_THROW((void)parse(type, p_text), ktrg::failure) << p_text;
}

TEST(values, json_that_nests_deeper_than_the_registry_is_refused)
{
    ktrg::value_arena arena;
    const std::string deep = std::string(100000, '[') + std::string(100000, ']');
    EXPECT_THROW((void)ktrg::parse_value(KT_INT32_ARRAY, {}, deep, arena), ktrg::failure);
}

TEST(values, floats_have_the_fewest_digits_that_read_back_the_same)
{
    EXPECT_EQ(ktrg::number_text(0.1), "0.1");
    EXPECT_EQ(ktrg::number_text(0.1F), "0.1");
    EXPECT_EQ(ktrg::number_text(1.0), "1.0");
    EXPECT_EQ(ktrg::number_text(-0.0), "-0.0");
    EXPECT_EQ(ktrg::number_text(1e300), "1e+300");
    EXPECT_EQ(ktrg::number_text(5e-324), "5e-324");
}

TEST(type_detection, finds_the_narrowest_kind_that_holds_all_cells)
{
    const auto detected = [](const std::vector<std::string> & cells) {
        ktrg::type_detector detector;
        for (const std::string & each : cells)
            detector.look_at(each);
        return detector.type();
    };
    EXPECT_EQ(detected({}), static_cast<kt_data_type_t>(KT_CHAR_PTR));
    EXPECT_EQ(detected({"1", "-2"}), static_cast<kt_data_type_t>(KT_INT64));
    EXPECT_EQ(detected({"9223372036854775808"}), static_cast<kt_data_type_t>(KT_UINT64));
    EXPECT_EQ(detected({"9223372036854775808", "-1"}), static_cast<kt_data_type_t>(KT_FLOAT64));
    EXPECT_EQ(detected({"1", "2.5"}), static_cast<kt_data_type_t>(KT_FLOAT64));
    EXPECT_EQ(detected({"nan", "2.5"}), static_cast<kt_data_type_t>(KT_FLOAT64));
    EXPECT_EQ(detected({"nan", "inf"}), static_cast<kt_data_type_t>(KT_CHAR_PTR));
    EXPECT_EQ(detected({"007"}), static_cast<kt_data_type_t>(KT_CHAR_PTR));
    EXPECT_EQ(detected({"0", "0.5"}), static_cast<kt_data_type_t>(KT_FLOAT64));
    EXPECT_EQ(detected({"1", "one"}), static_cast<kt_data_type_t>(KT_CHAR_PTR));
}

TEST(widths, are_those_on_the_screen)
{
    EXPECT_EQ(ktrg::display_width("abc"), 3U);
    EXPECT_EQ(ktrg::display_width("\xe6\x97\xa5"), 2U);
    EXPECT_EQ(ktrg::display_width("e\xcc\x81"), 1U);
    EXPECT_EQ(ktrg::cut_to_width("abcdef", 4), "abc\u2026");
    EXPECT_EQ(ktrg::cut_to_width("\xe6\x97\xa5\xe6\x97\xa5\xe6\x97\xa5", 4), "\xe6\x97\xa5\u2026");
    EXPECT_EQ(ktrg::cut_to_width("abcd", 4), "abcd");
    EXPECT_EQ(ktrg::cut_to_width("abcd", 0), "");
}

TEST(near_names, are_suggested_and_far_ones_are_not)
{
    EXPECT_EQ(ktrg::closest("nam", {"load", "name"}), "name");
    EXPECT_EQ(ktrg::closest("NAME", {"load", "name"}), "name");
    EXPECT_EQ(ktrg::closest("naem", {"load", "name"}), "name");
    EXPECT_EQ(ktrg::closest("frobnicate", {"load", "name"}), "");
    EXPECT_EQ(ktrg::closest("", {"load"}), "");
}

} // namespace
