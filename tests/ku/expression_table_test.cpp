// SPDX-License-Identifier: MIT
// The selection language by examples: expressions over one row, each with what it must give.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "expr_rows.h"
#include "kt_ku.h"

namespace
{

using namespace kt_test;

enum {
    no       = 0,
    yes      = 1,
    syntax   = -KU_EXPR_E_SYNTAX,
    no_name  = -KU_EXPR_E_NO_SUCH_NAME,
    types    = -KU_EXPR_E_TYPES,
    too_long = -KU_EXPR_E_TOO_LONG,
    fault    = -KU_EXPR_E_INTEGER_FAULT,
    absent   = -KU_EXPR_E_NO_SUCH_ELEMENT
};

struct example {
    std::string text;
    int         expected;
};

constexpr kt_resource_handle_t the_handle = {0x00021234, {0x0A, 0xBCDEF, 3, 0xFFFFFFFF}};

const expr_row & the_row()
{
    static const expr_row row = [] {
        expr_row r;
        r.add("five", i32(5));
        r.add("minus", i32(-5));
        r.add("zero", i32(0));
        r.add("i32_min", i32(INT32_MIN));
        r.add("i32_max", i32(INT32_MAX));
        r.add("u", u32(7));
        r.add("u32_max", u32(UINT32_MAX));
        r.add("i64_min", i64(INT64_MIN));
        r.add("i64_max", i64(INT64_MAX));
        r.add("big", i64(9007199254740993)); // 2^53 + 1
        r.add("u64_max", u64(UINT64_MAX));
        r.add("u64_half", u64(9223372036854775808u)); // 2^63
        r.add("tenth", f32(0.1f));
        r.add("half", f64(0.5));
        r.add("two_to_53", f64(9007199254740992.0));
        r.add("two_to_63", f64(9223372036854775808.0));
        r.add("two_to_64", f64(18446744073709551616.0));
        r.add("not_a_number", f64(std::nan("")));
        r.add("infinite", f64(std::numeric_limits<double>::infinity()));
        r.add("minus_zero", f64(-0.0));
        r.add("name", str("Hello"));
        r.add("none", str(""));
        r.add("path", str("/usr/lib/50%_of\\it"));
        r.add("utf", str("na\xC3\xAFve \xE2\x82\xAC"));
        r.add("bytes", bin(std::string("\x0A\x1F", 2)));
        r.add("bytes0", bin(""));
        r.add("rh", handle(the_handle));
        r.add("ints", array(KT_INT32_ARRAY, {i32(1), i32(-2), i32(30)}));
        r.add("empty", array(KT_INT64_ARRAY, {}));
        r.add("wide", array(KT_UINT64_ARRAY, {u64(0), u64(UINT64_MAX)}));
        r.add("reals", array(KT_FLOAT64_ARRAY, {f64(1.5), f64(std::nan(""))}));
        r.add("small", array(KT_FLOAT32_ARRAY, {f32(0.1f), f32(2.0f)}));
        r.add("tags", array(KT_CHAR_PTR_ARRAY, {str("red"), str("Green"), str("")}));
        r.add("blobs", array(KT_BINARY_PTR_ARRAY, {bin("\x01"), bin("")}));
        r.add("handles", array(KT_RSRC_HANDLE_PTR_ARRAY, {handle({}), handle(the_handle)}));
        r.add("sd", structure({{"a", i32(4)},
                               {"label", str("inner")},
                               {"list", array(KT_UINT32_ARRAY, {u32(8), u32(9)})},
                               {"and", u32(1)},
                               {"deep", structure({{"x", i32(1)}})},
                               {"raw", bin("zz")}}));
        r.add("sds", array(KT_SD_PTR_ARRAY, {structure({{"k", i32(1)}, {"v", str("one")}}),
                                             structure({{"k", i32(2)}, {"v", str("two")}})}));
        r.add("opaque", bytes_value(KT_SBS_PTR, ""));
        r.add("nothing", bytes_value(KT_NONE, ""));
        return r;
    }();
    return row;
}

void expect_all(const expr_row & row, const std::vector<example> & examples)
{
    for (const example & e : examples) {
        EXPECT_EQ(row.evaluate(e.text), e.expected) << e.text << "\n  " << ku_expr_diagnosis_1();
        const std::string diagnosis = ku_expr_diagnosis_1();
        const bool        refused   = e.expected < 0 && e.expected > fault;
        EXPECT_EQ(diagnosis.empty(), !refused) << e.text;
    }
}

TEST(selection, literals)
{
    expect_all(the_row(), {{"1", yes},
                           {"0", no},
                           {"00", no},
                           {"010 == 10", yes},
                           {"0x10 == 16", yes},
                           {"0xfF == 255", yes},
                           {"0x", syntax},
                           {"0xg", syntax},
                           {"0X10", syntax},
                           {"1.5 == 3.0 / 2.0", yes},
                           {".5 == half", yes},
                           {"1.", syntax},
                           {"1.x", syntax},
                           {"1e3 == 1000", yes},
                           {"1E+3 == 1000", yes},
                           {"25e-1 == 2.5", yes},
                           {"1e", syntax},
                           {"1e+", syntax},
                           {"1.5.5", syntax},
                           {"1 2", syntax},
                           {"12abc", syntax},
                           {"1_000", syntax},
                           {"0x1.5", syntax},
                           {"18446744073709551615 == u64_max", yes},
                           {"18446744073709551616", syntax},
                           {"0xFFFFFFFFFFFFFFFF == u64_max", yes},
                           {"0x1FFFFFFFFFFFFFFFF", syntax},
                           {"0x00000000000000000001 == 1", yes},
                           {"18446744073709551616.0 == two_to_64", yes},
                           {"1e999 == inf", yes},
                           {"1e-999 == 0", yes},
                           {"1e99999999999999999999 == inf", yes},
                           {"0.0000000001e-99999999999999999999 == 0", yes},
                           {"inf == infinite", yes},
                           {"-inf < i64_min", yes},
                           {"nan == nan", no},
                           {"nan != nan", yes},
                           {"INF", no_name},
                           {"\"a\" == 'a'", yes},
                           {"\"\" == ''", yes},
                           {"\"it's\" == $'it\\'s'", yes},
                           {"'say \"x\"' == $\"say \\\"x\\\"\"", yes},
                           {"\"a\\b\" == $\"a\\\\b\"", yes},
                           {"\"\\n\" == $\"\\n\"", no},
                           {"$\"\\x41\\x42\" == \"AB\"", yes},
                           {"$\"\\u0041\\u00ef\\u20aC\" == \"A\xC3\xAF\xE2\x82\xAC\"", yes},
                           {"$\"\\t\\r\\n\" == \"\t\r\n\"", yes},
                           {"$\"\\xE9\" == \"\xC3\xA9\"", no},
                           {"$\"\\q\"", syntax},
                           {"$\"\\x0\"", syntax},
                           {"$\"\\x00\" == name", syntax},
                           {"$\"\\u0000\" == name", syntax},
                           {"$\"\\ud800\" == name", syntax},
                           {"$\"\\uDFFF\" == name", syntax},
                           {"$\"\\u12\" == name", syntax},
                           {"$\"\\", syntax},
                           {"$\"\\\"", syntax},
                           {"\"open", syntax},
                           {"'open\"", syntax},
                           {"$", syntax},
                           {"$x", syntax},
                           {"#", syntax},
                           {"name == \"Hello\" # no", syntax},
                           {"\x01", syntax},
                           {"@", syntax}});
}

TEST(selection, precedence_and_grammar)
{
    expect_all(the_row(), {{"1 + 2 * 3 == 7", yes},
                           {"(1 + 2) * 3 == 9", yes},
                           {"10 - 3 - 2 == 5", yes},
                           {"100 / 5 / 2 == 10", yes},
                           {"7 & 3 + 1 == 4", yes},
                           {"1 | 2 ^ 3 == 0", yes}, // bit operators are of one rank, from left to right
                           {"6 & 3 | 8 == 10", yes},
                           {"1 || 0 && 0", yes},
                           {"(1 || 0) && 0", no},
                           {"!0 == 0", no}, // ! takes the whole comparison
                           {"!zero && 1", yes},
                           {"!!five", yes},
                           {"! five > 9", yes},
                           {"-2 * -3 == 6", yes},
                           {"--5 == 5", yes},
                           {"-+-5 == 5", yes},
                           {"~~5 == 5", yes},
                           {"-~5 == 6", yes},
                           {"1 - -1 == 2", yes},
                           {"1 -1 == 0", yes},
                           {"five-1 == 4", yes},
                           {"1 < 2 < 3", syntax},
                           {"1 == 1 == 1", syntax},
                           {"(1 == 1) == 1", yes},
                           {"1 + !0", syntax},
                           {"five = 5", yes},
                           {"five == 5", yes},
                           {"five <> 6", yes},
                           {"five != 5", no},
                           {"five =< 6", syntax},
                           {"five > = 6", syntax},
                           {"1 & & 1", syntax},
                           {"1 &&& 1", syntax},
                           {"1 ||| 1", syntax},
                           {"five AND five", yes},
                           {"zero or five", yes},
                           {"zero Or five And zero", no},
                           {"five and", syntax},
                           {"and five", no_name},
                           {"not five", no_name},
                           {"five not 5", syntax},
                           {"name not like \"x%\"", yes},
                           {"name NOT Like \"H%\"", no},
                           {"five not in (1, 2)", yes},
                           {"five Not In (1, 5)", no},
                           {"five in ()", syntax},
                           {"five in (5,)", syntax},
                           {"five in (5", syntax},
                           {"five in 5", types},
                           {"five in (1 && 1)", syntax},
                           {"five in ((1 && 1) * 5)", yes},
                           {"", syntax},
                           {"   ", syntax},
                           {"()", syntax},
                           {"(", syntax},
                           {")", syntax},
                           {"(1", syntax},
                           {"1)", syntax},
                           {"1,2", syntax},
                           {"[1]", syntax},
                           {"five[", types},
                           {"ints[", syntax},
                           {"+", syntax},
                           {"!", syntax},
                           {"1 +", syntax},
                           {"* 1", syntax},
                           {"\t1\n==\r1 ", yes},
                           {"five\v>\f4", yes},
                           {"1==1&&2==2||0", yes},
                           {"missing", no_name},
                           {"fiv", no_name},
                           {"five five", syntax},
                           {"foo(1)", syntax},
                           {"LENGTH(name)", syntax},
                           {"!~5", syntax}, // one token
                           {"! ~5", no},
                           {"five=~\"5\"", types},
                           {"five =-5", no}});
}

TEST(selection, words_are_names_where_a_name_can_stand)
{
    expr_row row;
    row.add("and", i32(1));
    row.add("or", i32(2));
    row.add("not", i32(3));
    row.add("in", i32(4));
    row.add("like", str("like"));
    row.add("length", i32(6));
    row.add("count", i32(7));
    row.add("contains", i32(8));
    row.add("inf", i32(9));
    row.add("nan", i32(10));
    row.add("lower", str("LOW"));
    row.add("upper", array(KT_INT32_ARRAY, {i32(4)}));
    expect_all(row, {{"and", yes},
                     {"and and and", yes},
                     {"and == 1 and or == 2 or not == 9", yes},
                     {"not not in (3, 4)", no},
                     {"not in (3, 4)", yes},
                     {"in in (in)", yes},
                     {"in not in (in)", no},
                     {"in in upper", yes},
                     {"like like \"l%\"", yes},
                     {"like not like like", no},
                     {"length == 6", yes},
                     {"length(like) == 4", yes},
                     {"length (like) == 4 && length > 5", yes},
                     {"count > 6", yes},
                     {"count(upper) == 1", yes},
                     {"contains(upper, in) and contains == 8", yes},
                     {"inf == 9", yes},
                     {"nan == nan", yes},
                     {"lower(lower) == \"low\"", yes},
                     {"upper[0] == 4", yes},
                     {"or || and", yes}});
}

TEST(selection, integers_compare_by_mathematical_value)
{
    expect_all(the_row(), {{"minus < u", yes},
                           {"minus < u32_max", yes},
                           {"minus < u64_max", yes},
                           {"i64_min < u64_max", yes},
                           {"u64_max > i64_max", yes},
                           {"u64_half == i64_max + 1", yes},
                           {"u64_half > i64_max", yes},
                           {"u64_max == -1", no},
                           {"u32_max == -1", no},
                           {"u32_max == 4294967295", yes},
                           {"i32_min == -2147483648", yes},
                           {"i32_min < -2147483647", yes},
                           {"i64_min == -9223372036854775808", yes},
                           {"i64_min >= -9223372036854775808", yes},
                           {"i64_min < -9223372036854775808", no},
                           {"i64_min > -9223372036854775808", no},
                           {"i64_max == 9223372036854775807", yes},
                           {"i64_max < 9223372036854775808", yes},
                           {"i64_max >= 9223372036854775808", no},
                           {"u64_max == 18446744073709551615", yes},
                           {"u64_max < 18446744073709551615", no},
                           {"u64_max >= 0", yes},
                           {"u64_max > -1", yes},
                           {"u > -1", yes},
                           {"u < -1", no},
                           {"five > 4294967296", no},
                           {"five != 4294967296", yes},
                           {"five < 18446744073709551615", yes},
                           {"5 == five", yes},
                           {"5 < five", no},
                           {"4 < five", yes},
                           {"5 <= five", yes},
                           {"6 > five", yes},
                           {"5 >= five", yes},
                           {"4 != five", yes},
                           {"five == u - 2", yes},
                           {"minus == i32_min", no}});
}

TEST(selection, integers_and_floating_point_compare_exactly)
{
    expect_all(the_row(), {{"big == two_to_53", no},
                           {"big > two_to_53", yes},
                           {"big == 9007199254740993", yes},
                           {"two_to_53 < 9007199254740993", yes},
                           {"two_to_53 == 9007199254740993", no},
                           {"two_to_53 != 9007199254740993", yes},
                           {"two_to_53 >= 9007199254740993", no},
                           {"two_to_53 <= 9007199254740993", yes},
                           {"two_to_53 == 9007199254740992", yes},
                           {"two_to_53 > 9007199254740991", yes},
                           {"9007199254740993 > two_to_53", yes},
                           {"i64_max < two_to_63", yes},
                           {"i64_max == two_to_63", no},
                           {"u64_half == two_to_63", yes},
                           {"i64_min == -two_to_63", yes},
                           {"i64_min < -two_to_63", no},
                           {"u64_max < two_to_64", yes},
                           {"u64_max == two_to_64", no},
                           {"two_to_64 > u64_max", yes},
                           {"two_to_64 > 18446744073709551615", yes},
                           {"two_to_64 <= 18446744073709551615", no},
                           {"i64_max < 9223372036854775807.0", yes},
                           {"i64_max >= 9223372036854775807.0", no},
                           {"five > 4.9", yes},
                           {"five > 5.0", no},
                           {"five >= 5.0", yes},
                           {"five < 5.1", yes},
                           {"five == 5.0", yes},
                           {"five == 5.5", no},
                           {"five != 5.5", yes},
                           {"minus < -4.5", yes},
                           {"minus > -5.5", yes},
                           {"minus >= -4.5", no},
                           {"minus <= -5.5", no},
                           {"u64_max < 1e300", yes},
                           {"u64_max > -1e300", yes},
                           {"u64_max == 1e300", no},
                           {"five < inf", yes},
                           {"five > -inf", yes},
                           {"five == inf", no},
                           {"five < nan", no},
                           {"five >= nan", no},
                           {"five == nan", no},
                           {"five != nan", yes},
                           {"not_a_number == not_a_number", no},
                           {"not_a_number != not_a_number", yes},
                           {"not_a_number < 1", no},
                           {"not_a_number > 1", no},
                           {"not_a_number <= 1", no},
                           {"not_a_number >= 1", no},
                           {"not_a_number == 1", no},
                           {"not_a_number != 1", yes},
                           {"!(not_a_number < 1)", yes},
                           {"!(not_a_number != 1)", no},
                           {"not_a_number != 9007199254740993", yes},
                           {"minus_zero == 0", yes},
                           {"minus_zero < 0", no},
                           {"infinite == inf", yes},
                           {"infinite > 18446744073709551615", yes},
                           {"-infinite < -9223372036854775808", yes},
                           {"tenth == 0.1", no},
                           {"tenth > 0.1", yes},
                           {"tenth < 0.100000002", yes},
                           {"half == 0.5", yes},
                           {"half * 2 == 1", yes}});
}

TEST(selection, integer_arithmetic_is_exact_or_a_fault)
{
    expect_all(the_row(), {{"i32_max + 1 == 2147483648", yes},
                           {"i32_min - 1 == -2147483649", yes},
                           {"-i32_min == 2147483648", yes},
                           {"u32_max + 1 == 4294967296", yes},
                           {"u32_max * u32_max == 18446744065119617025", yes},
                           {"u - 8 == -1", yes},
                           {"i64_max + 1 == 9223372036854775808", yes},
                           {"i64_max + i64_max + 1 == u64_max", yes},
                           {"i64_max + i64_max + 2 == 0", fault},
                           {"u64_max + 1 > 0", fault},
                           {"u64_max - u64_max == 0", yes},
                           {"u64_max + minus == 18446744073709551610", yes},
                           {"i64_min - 1 < 0", fault},
                           {"-i64_min == u64_half", yes},
                           {"-u64_half == i64_min", yes},
                           {"-u64_max < 0", fault},
                           {"-(u64_half + 1) < 0", fault},
                           {"u64_half * 2 > 0", fault},
                           {"u64_half * 1 == u64_half", yes},
                           {"u64_half * -1 == i64_min", yes},
                           {"i64_min * -1 == u64_half", yes},
                           {"i64_min * 2 < 0", fault},
                           {"i64_min * -2 > 0", fault},
                           {"u64_max * zero == 0", yes},
                           {"u64_max * -1 < 0", fault},
                           {"4294967296 * 4294967296 > 0", fault},
                           {"4294967295 * 4294967297 == u64_max", yes},
                           {"7 / 2 == 3", yes},
                           {"-7 / 2 == -3", yes},
                           {"7 / -2 == -3", yes},
                           {"-7 / -2 == 3", yes},
                           {"7 % 3 == 1", yes},
                           {"-7 % 3 == -1", yes},
                           {"7 % -3 == 1", yes},
                           {"-7 % -3 == -1", yes},
                           {"i64_min / -1 == u64_half", yes},
                           {"i64_min % -1 == 0", yes},
                           {"u64_max / -1 < 0", fault},
                           {"u64_max / -2 == -9223372036854775807", yes},
                           {"u64_max % 10 == 5", yes},
                           {"u64_max % -10 == 5", yes},
                           {"five / zero", fault},
                           {"five % zero", fault},
                           {"1 / 0", fault},
                           {"1 % 0", fault},
                           {"0 && 1 / 0", no},
                           {"zero && five / zero", no},
                           {"five || five / zero", yes},
                           {"1 || 1 / 0", yes},
                           {"zero || five / zero", fault},
                           {"five / zero && zero", fault},
                           {"five in (5, 1 / zero)", yes},
                           {"five in (1 / zero, 5)", fault}});
}

TEST(selection, floating_point_arithmetic_has_no_faults)
{
    expect_all(the_row(), {{"1.0 / 0.0 == inf", yes},
                           {"-1.0 / 0 == -inf", yes},
                           {"half / zero == inf", yes},
                           {"0.0 / 0.0 == nan", no},
                           {"0.0 / 0.0 != 0.0 / 0.0", yes},
                           {"inf - inf != 0", yes},
                           {"five + half == 5.5", yes},
                           {"half + five == 5.5", yes},
                           {"five * half == 2.5", yes},
                           {"five - half == 4.5", yes},
                           {"half - five == -4.5", yes},
                           {"5 / 2.0 == 2.5", yes},
                           {"five / 2.0 == 2.5", yes},
                           {"half + half == 1", yes},
                           {"-half == -0.5", yes},
                           {"+half == 0.5", yes},
                           {"u64_max + 0.0 == two_to_64", yes}, // becomes the nearest one
                           {"half % 2", types},
                           {"five % 2.0", types},
                           {"half & 1", types},
                           {"1 | 1.0", types},
                           {"~half", types},
                           {"~1.5", types},
                           {"1e308 * 10 == inf", yes}});
}

TEST(selection, bits)
{
    expect_all(the_row(), {{"~0 == -1", yes},
                           {"~five == -6", yes},
                           {"~minus == 4", yes},
                           {"~u == 4294967288", yes},
                           {"~u32_max == 0", yes},
                           {"~u64_max == 0", yes},
                           {"~u64_half == 9223372036854775807", yes},
                           {"~(u) == 4294967288", yes},
                           {"~+u == 4294967288", yes},
                           {"~~u == 7", yes},
                           {"~(u + 0) == -8", yes}, // computed, so no longer a column's width
                           {"~(u | u) == 4294967288", yes},
                           {"~(u & u64_max) == 18446744073709551608", yes},
                           {"~(u & 15) == -8", yes},
                           {"~9223372036854775807 == -9223372036854775808", yes},
                           {"~9223372036854775808 == 9223372036854775807", yes},
                           {"~i64_min == i64_max", yes},
                           {"5 & 3 == 1", yes},
                           {"(5 & 3) == 1", yes},
                           {"5 | 3 == 7", yes},
                           {"5 ^ 3 == 6", yes},
                           {"minus & 255 == 251", yes},
                           {"minus | 1 == -5", yes},
                           {"minus ^ minus == 0", yes},
                           {"u64_max & 255 == 255", yes},
                           {"u64_max & -1 == -1", yes}, // signed, since an operand is negative
                           {"u64_max ^ -1 == 0", yes},
                           {"u64_max | 0 == u64_max", yes},
                           {"i64_min & u64_max == i64_min", yes},
                           {"u64_half | 1 == 9223372036854775809", yes},
                           {"five & ~1 == 4", yes},
                           {"(five > 1) + (five > 2) == 2", yes},
                           {"(five > 1) & 1", yes}});
}

TEST(selection, truth)
{
    expect_all(the_row(), {{"five", yes},
                           {"minus", yes},
                           {"zero", no},
                           {"half", yes},
                           {"minus_zero", no},
                           {"not_a_number", yes},
                           {"nan", yes},
                           {"!nan", no},
                           {"infinite && half", yes},
                           {"0.0 || zero", no},
                           {"name", types},
                           {"name && 1", types},
                           {"1 || name", types},
                           {"!name", types},
                           {"ints", types},
                           {"sd", types},
                           {"bytes", types},
                           {"rh", types},
                           {"opaque", types},
                           {"nothing", types},
                           {"(five && half) == 1", yes},
                           {"(five || 0) == 1", yes},
                           {"(five && half) + (zero || 0) == 1", yes},
                           {"!five == !half", syntax},
                           {"(!five) == (!half)", yes},
                           {"five && half && name == \"Hello\" && zero", no},
                           {"zero || half || five / zero", yes},
                           {"zero || (half && zero) || u", yes},
                           {"(zero || half) && (five || zero) && u", yes},
                           {"1 && five", yes},
                           {"five && 1", yes},
                           {"five && 0", no},
                           {"five && 0 && missing", no_name},
                           {"0 && name == 5", types},
                           {"0 || 0 || five", yes},
                           {"0 || 0", no},
                           {"1 && 1 && 1", yes},
                           {"!(five > 4 && zero)", yes},
                           {"!(five in (5))", no},
                           {"!1", no},
                           {"!0.0", yes},
                           {"1.5 && 2", yes}});
}

TEST(selection, strings)
{
    expect_all(the_row(), {{"name == \"Hello\"", yes},
                           {"name == \"Hell\"", no},
                           {"name == \"Hello!\"", no},
                           {"name == \"hello\"", no},
                           {"\"Hello\" == name", yes},
                           {"name != \"Hello\"", no},
                           {"name < \"Hellp\"", yes},
                           {"name < \"Hello\"", no},
                           {"name <= \"Hello\"", yes},
                           {"name > \"Hell\"", yes},
                           {"name > \"Hello World\"", no},
                           {"name >= \"Hello\"", yes},
                           {"\"Hellp\" > name", yes},
                           {"name < \"a\"", yes}, // by bytes: capitals first
                           {"none == \"\"", yes},
                           {"none < name", yes},
                           {"name == name", yes},
                           {"utf > \"z\"", no},
                           {"\"\xC3\xA9\" > \"z\"", yes},
                           {"\"a\" < \"b\"", yes},
                           {"\"a\" == \"a\"", yes},
                           {"name == 5", types},
                           {"5 < name", types},
                           {"name + name", types},
                           {"-name", types},
                           {"length(name) == 5", yes},
                           {"length(none) == 0", yes},
                           {"length(utf) == 10", yes}, // bytes
                           {"length(\"abc\") == 3", yes},
                           {"length(five)", types},
                           {"length(ints)", types},
                           {"length(rh)", types},
                           {"length()", syntax},
                           {"length(name, name)", syntax},
                           {"lower(name) == \"hello\"", yes},
                           {"upper(name) == \"HELLO\"", yes},
                           {"upper(lower(name)) == \"HELLO\"", yes},
                           {"lower(upper(name)) == \"hello\"", yes},
                           {"lower(name) == lower(\"HELLO\")", yes},
                           {"lower(name) < name", no},
                           {"upper(name) < name", yes},
                           {"upper(utf) == \"NA\xC3\xAFVE \xE2\x82\xAC\"", yes},
                           {"length(lower(name)) == 5", yes},
                           {"lower(name) in (\"x\", \"hello\")", yes},
                           {"lower(five)", types},
                           {"lower(name, name)", syntax},
                           {"name in (\"a\", \"Hello\")", yes},
                           {"name in (\"a\", \"b\")", no},
                           {"\"x\" in (name, \"x\")", yes},
                           {"name in (1, \"Hello\")", types},
                           {"(\"Hello\") == (name)", yes}});
}

TEST(selection, like)
{
    expect_all(the_row(), {{"name like \"Hello\"", yes},
                           {"name like \"hello\"", no},
                           {"name like \"H%\"", yes},
                           {"name like \"%o\"", yes},
                           {"name like \"%ll%\"", yes},
                           {"name like \"%\"", yes},
                           {"name like \"%%\"", yes},
                           {"none like \"%\"", yes},
                           {"none like \"\"", yes},
                           {"name like \"\"", no},
                           {"name like \"_____\"", yes},
                           {"name like \"____\"", no},
                           {"name like \"______\"", no},
                           {"name like \"H_l%\"", yes},
                           {"name like \"%l_\"", yes},
                           {"name like \"H%o\"", yes},
                           {"name like \"H%l%o\"", yes},
                           {"name like \"%l%l%l%\"", no},
                           {"name like \"%l%l%\"", yes},
                           {"name like \"ello%\"", no},
                           {"name like \"%Hell\"", no},
                           {"name like \"%x%\"", no},
                           {"name not like \"%x%\"", yes},
                           {"name not like \"H%\"", no},
                           {"path like \"%50\\%%\"", yes},
                           {"path like \"%5\\%%\"", no},
                           {"path like \"%\\_of%\"", yes},
                           {"path like \"%\\\\it\"", yes},
                           {"path like $\"%\\\\\\\\it\"", yes},
                           {"path like \"%\\it\"", yes}, // a backslash takes the next character as it is
                           {"name like \"\\H%\"", yes},
                           {"path like \"/usr\\/lib%\"", yes},
                           {"path like \"%it\\\"", no},
                           {"utf like \"na_ve%\"", yes},
                           {"utf like \"na__ve%\"", no},
                           {"utf like \"na_ve _\"", yes},
                           {"utf like \"%_\"", yes},
                           {"utf like \"%__ve__\"", yes},
                           {"utf like \"_______\"", yes},
                           {"utf like \"________\"", no},
                           {"utf like \"%\xE2\x82\xAC\"", yes},
                           {"name like name", yes},
                           {"\"xHello\" like name", no},
                           {"name like upper(\"h\") ", no},
                           {"lower(name) like \"hel%\"", yes},
                           {"upper(name) like \"hel%\"", no},
                           {"\"abc\" like \"a_c\"", yes},
                           {"tags[1] like \"G%\"", yes},
                           {"five like \"5\"", types},
                           {"name like 5", types},
                           {"name like", syntax}});
}

TEST(selection, regular_expressions)
{
    expect_all(the_row(), {{"name =~ \"ell\"", yes},
                           {"name =~ \"^Hel+o$\"", yes},
                           {"name =~ \"^ell\"", no},
                           {"name =~ \"ell$\"", no},
                           {"name !~ \"x\"", yes},
                           {"name !~ \"l\"", no},
                           {"name =~ \"\"", yes},
                           {"none =~ \"^$\"", yes},
                           {"none =~ \".\"", no},
                           {"name =~ \"^(Hello|World)$\"", yes},
                           {"name =~ \"^[[:alpha:]]{5}$\"", yes},
                           {"name =~ \"^[[:alpha:]]{6,}$\"", no},
                           {"name =~ \"[^a-zA-Z]\"", no},
                           {"name =~ \"^[H-J][^x]ll.$\"", yes},
                           {"utf =~ \"^na.ve .$\"", yes},
                           {"utf =~ \"[\xC3\xAF-\xC3\xB0]\"", yes},
                           {"utf =~ \"[\xE2\x82\xAC]$\"", yes},
                           {"path =~ \"50%_\"", yes},
                           {"path =~ \"\\\\\"", yes},
                           {"path =~ $\"^/usr/.*\\\\\\\\it$\"", yes},
                           {"path =~ \"\\.\"", no},
                           {"lower(name) =~ \"^hello$\"", yes},
                           {"upper(name) =~ \"^[A-Z]*$\"", yes},
                           {"name =~ name", syntax},
                           {"name =~ (\"a\")", syntax},
                           {"name =~ 5", syntax},
                           {"five =~ \"5\"", types},
                           {"name =~ \"(\"", syntax},
                           {"name =~ \")\"", syntax},
                           {"name =~ \"[a\"", syntax},
                           {"name =~ \"[]\"", syntax},
                           {"name =~ \"[z-a]\"", syntax},
                           {"name =~ \"[[:word:]]\"", syntax},
                           {"name =~ \"*a\"", syntax},
                           {"name =~ \"a|*\"", syntax},
                           {"name =~ \"a{2,1}\"", syntax},
                           {"name =~ \"a{256}\"", syntax},
                           {"name =~ \"a{\"", syntax},
                           {"name =~ \"a{,2}\"", syntax},
                           {"name =~ \"\\\"", syntax},
                           {"name =~ \"\\w\"", syntax},
                           {"name =~ \"(l)\\1\"", syntax},
                           {"name =~ $\"\\xFF\"", syntax},
                           {"name =~ \"((((a{255}){255}){255}){255})\"", too_long},
                           {"name =~ \"((((){255}){255}){255}){255}\"", too_long},
                           {"tags[0] =~ \"^r\" && five =~ 5", syntax}});
}

TEST(selection, binaries_and_resource_handles)
{
    const std::string words = "0x1234 0x0002 0x0000000a 0x000bcdef 0x00000003 0xffffffff";
    const std::string upper = "0x1234 0x0002 0x0000000A 0x000BCDEF 0x00000003 0xFFFFFFFF";
    expect_all(the_row(), {{"bytes == \"0x0a1f\"", yes},
                           {"bytes == \"0x0A1F\"", yes},
                           {"\"0x0a1f\" == bytes", yes},
                           {"bytes != \"0x0a1f\"", no},
                           {"bytes == \"0x0a\"", no},
                           {"bytes == \"0x0a1f00\"", no},
                           {"bytes == \"0x\"", no},
                           {"bytes0 == \"0x\"", yes},
                           {"bytes == bytes", yes},
                           {"bytes == bytes0", no},
                           {"bytes != bytes0", yes},
                           {"bytes == \"0a1f\"", types},
                           {"bytes == \"0X0a1f\"", types},
                           {"bytes == \"0x0a1\"", types},
                           {"bytes == \"0x0g\"", types},
                           {"bytes == \"\"", types},
                           {"bytes == name", types},
                           {"bytes == lower(\"0x0A1F\")", types},
                           {"bytes == 5", types},
                           {"bytes < \"0x0a1f\"", types},
                           {"bytes >= bytes", types},
                           {"bytes like \"0x%\"", types},
                           {"bytes =~ \"0\"", types},
                           {"bytes in (\"0x00\", \"0x0a1f\")", yes},
                           {"bytes in (\"0x00\", bytes0)", no},
                           {"\"0x0a1f\" in (bytes0, bytes)", yes},
                           {"bytes not in (\"0x0a1f\")", no},
                           {"bytes in (name)", types},
                           {"length(bytes) == 2", yes},
                           {"length(bytes0) == 0", yes},
                           {"rh == \"" + words + "\"", yes},
                           {"rh == \"" + upper + "\"", yes},
                           {"'" + words + "' == rh", yes},
                           {"rh != \"" + words + "\"", no},
                           {"rh == \"0x1234 0x0002 0x0000000a 0x000bcdef 0x00000003 0x00000000\"", no},
                           {"rh == \"0x1234 0x0002 0x0000000a 0x000bcdef 0x00000003\"", types},
                           {"rh == \" " + words + "\"", types},
                           {"rh == \"0x1234  0x0002 0x0000000a 0x000bcdef 0x00000003 0xffffffff\"", types},
                           {"rh == rh", yes},
                           {"rh == handles[1]", yes},
                           {"rh == handles[0]", no},
                           {"rh in handles", yes},
                           {"\"" + words + "\" in handles", yes},
                           {"contains(handles, \"" + words + "\")", yes},
                           {"rh == bytes", no},
                           {"rh in (bytes, \"" + words + "\")", yes},
                           {"\"0x01\" in blobs", yes},
                           {"\"0x\" in blobs", yes},
                           {"\"0x02\" in blobs", no},
                           {"bytes in blobs", no},
                           {"blobs[0] == \"0x01\"", yes},
                           {"length(blobs[0]) == 1", yes},
                           {"name in blobs", types},
                           {"~bytes", types}});
}

TEST(selection, arrays)
{
    expect_all(the_row(), {{"ints[0] == 1", yes},
                           {"ints[1] == -2", yes},
                           {"ints[1 + 1] == 30", yes},
                           {"ints[3]", absent},
                           {"ints[-1]", absent},
                           {"ints[u64_max]", absent},
                           {"ints[i64_min]", absent},
                           {"empty[0]", absent},
                           {"ints[zero] == 1", yes},
                           {"ints[ints[0]] == -2", yes},
                           {"ints[half]", types},
                           {"ints[name]", types},
                           {"ints[]", syntax},
                           {"ints[0", syntax},
                           {"ints[0][0]", types},
                           {"five[0]", types},
                           {"ints[(1 || 0)] == -2", yes},
                           {"ints[1 || 0]", syntax},
                           {"count(ints) == 3", yes},
                           {"count(empty) == 0", yes},
                           {"count(name)", types},
                           {"count(five)", types},
                           {"ints[count(ints) - 1] == 30", yes},
                           {"30 in ints", yes},
                           {"31 in ints", no},
                           {"31 not in ints", yes},
                           {"1 not in ints", no},
                           {"five in ints", no},
                           {"1.0 in ints", yes},
                           {"1.5 in ints", no},
                           {"-2 in ints", yes},
                           {"1 in empty", no},
                           {"u64_max in wide", yes},
                           {"-1 in wide", no},
                           {"wide[1] == u64_max", yes},
                           {"~wide[1] == 0", yes},
                           {"1.5 in reals", yes},
                           {"nan in reals", no},
                           {"1 in small", no},
                           {"2 in small", yes},
                           {"tenth in small", yes},
                           {"0.1 in small", no},
                           {"small[0] == tenth", yes},
                           {"\"red\" in tags", yes},
                           {"\"green\" in tags", no},
                           {"\"\" in tags", yes},
                           {"name in tags", no},
                           {"lower(tags[1]) == \"green\"", yes},
                           {"lower(\"RED\") in tags", yes},
                           {"5 in tags", types},
                           {"name in ints", types},
                           {"ints in ints", types},
                           {"1 in sds", types},
                           {"contains(ints, 30)", yes},
                           {"contains(ints, 31)", no},
                           {"!contains(ints, 31)", yes},
                           {"contains(tags, \"red\")", yes},
                           {"contains(tags, 1)", types},
                           {"contains(name, \"e\")", types},
                           {"contains(ints)", syntax},
                           {"contains(ints, 1, 2)", syntax},
                           {"contains(ints, zero || five)", yes},
                           {"contains(ints, five / zero)", fault},
                           {"ints == ints", types},
                           {"tags[0] < tags[1]", no},
                           {"1 in (ints)", types}});
}

TEST(selection, structured_data)
{
    expect_all(the_row(), {{"sd.a == 4", yes},
                           {"sd . a == 4", yes},
                           {"sd.label == \"inner\"", yes},
                           {"sd.label like \"in%\"", yes},
                           {"sd.and == 1 and sd.and", yes},
                           {"sd.list[1] == 9", yes},
                           {"sd.list[2]", absent},
                           {"~sd.list[0] == 4294967287", yes},
                           {"8 in sd.list", yes},
                           {"count(sd.list) == 2", yes},
                           {"count(sd) == 6", yes},
                           {"length(sd.raw) == 2", yes},
                           {"sd.raw == \"0x7a7a\"", yes},
                           {"sd.missing", no_name},
                           {"sd.", syntax},
                           {"sd.5", syntax},
                           {"sd.\"a\"", syntax},
                           {"sd.a.b", types},
                           {"sd[0]", types},
                           {"five.a", types},
                           {"ints.a", types},
                           {"sds.k", types},
                           {"sd.deep.x", no_name},
                           {"count(sd.deep) == 1", yes},
                           {"sds[0].k == 1", yes},
                           {"sds[1].v == \"two\"", yes},
                           {"sds[five - 4].k == 2", yes},
                           {"sds[2].k", absent},
                           {"sds[0].missing", no_name},
                           {"count(sds) == 2", yes},
                           {"count(sds[0]) == 2", yes},
                           {"sds[0] == sds[0]", types},
                           {"sd == sd", types},
                           {"opaque == 1", types},
                           {"count(opaque)", types},
                           {"nothing == 1", types}});
}

} // namespace
