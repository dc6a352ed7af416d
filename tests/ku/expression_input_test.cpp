// SPDX-License-Identifier: MIT
// The selection language on bad input and bad luck: texts that are no expressions, rows that are damaged, memory that
// runs out; and what a refused text is told.
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "expr_rows.h"
#include "kt_ku.h"
#include "support/faults.h"

namespace
{

using namespace kt_test;

expr_row small_row()
{
    expr_row r;
    r.add("count", i32(5));
    r.add("name", str("abc"));
    r.add("ratio", f64(0.5));
    r.add("data", bin("xy"));
    r.add("rh", handle({}));
    r.add("list", array(KT_INT32_ARRAY, {i32(1), i32(2)}));
    r.add("tags", array(KT_CHAR_PTR_ARRAY, {str("one"), str("two")}));
    r.add("sd", structure({{"a", i32(1)}, {"s", str("in")}, {"l", array(KT_UINT32_ARRAY, {u32(1)})}}));
    return r;
}

std::string diagnosis_of(const std::string & text)
{
    void *           p_compiled = nullptr;
    const kt_int32_t rc         = small_row().compile(text, &p_compiled);
    EXPECT_NE(rc, 0) << text;
    EXPECT_EQ(p_compiled, nullptr);
    if (rc == 0)
        ku_free_expr_1(p_compiled, 0);
    return ku_expr_diagnosis_1();
}

// ---- What a refused text is told ----

TEST(a_diagnosis, tells_the_column_and_what_is_wrong)
{
    EXPECT_EQ(diagnosis_of("count == 5 and Nmae == 3"), "column 16: no column named \"Nmae\"");
    EXPECT_EQ(diagnosis_of("count >"), "column 8: expected a value, found the end of the text");
    EXPECT_EQ(diagnosis_of(""), "column 1: expected a value, found the end of the text");
    EXPECT_EQ(diagnosis_of("(count > 1"), "column 11: expected an operator or `)`, found the end of the text");
    EXPECT_EQ(diagnosis_of("count > 1)"), "column 10: expected an operator, found `)`");
    EXPECT_EQ(diagnosis_of("count 5"), "column 7: expected an operator, found `5`");
    EXPECT_EQ(diagnosis_of("count not 5"), "column 11: expected `like` or `in` behind `not`, found `5`");
    EXPECT_EQ(diagnosis_of("name > 5"), "column 6: `>` cannot take a string and an integer");
    EXPECT_EQ(diagnosis_of("data < data"), "column 6: `<` cannot take a binary and a binary");
    EXPECT_EQ(diagnosis_of("rh == \"x\""),
              "column 7: a literal that stands for bytes must have the form \"0x0a1f\" or that of $RH");
    EXPECT_EQ(diagnosis_of("rh == name"),
              "column 4: a binary or a resource handle can only be compared with its like or with a literal");
    EXPECT_EQ(diagnosis_of("name"), "column 1: a condition must be a number, not a string");
    EXPECT_EQ(diagnosis_of("count && (list)"), "column 10: a condition must be a number, not an array");
    EXPECT_EQ(diagnosis_of("1 +- name"), "column 4: a sign stands before a number, not a string");
    EXPECT_EQ(diagnosis_of("~ratio"), "column 1: `~` takes an integer, not a floating-point number");
    EXPECT_EQ(diagnosis_of("count.x"), "column 6: only structured data has fields, not an integer");
    EXPECT_EQ(diagnosis_of("sd.x"), "column 4: no field named \"x\"");
    EXPECT_EQ(diagnosis_of("sd.5"), "column 3: expected an operator, found `.5`");
    EXPECT_EQ(diagnosis_of("sd.'5'"), "column 4: expected the name of a field, found `'5'`");
    EXPECT_EQ(diagnosis_of("name[0]"), "column 5: only an array has elements, not a string");
    EXPECT_EQ(diagnosis_of("list[ratio]"), "column 6: an index must be an integer, not a floating-point number");
    EXPECT_EQ(diagnosis_of("list[0"), "column 7: expected an operator or `]`, found the end of the text");
    EXPECT_EQ(diagnosis_of("1 in 2"), "column 6: `in` needs an array or a list in parentheses, not an integer");
    EXPECT_EQ(diagnosis_of("1 in (2 3)"), "column 9: expected `,` or `)`, found `3`");
    EXPECT_EQ(diagnosis_of("length(count)"), "column 1: `length` takes a string or a binary, not an integer");
    EXPECT_EQ(diagnosis_of("length(name, name)"), "column 14: `length` takes 1 argument");
    EXPECT_EQ(diagnosis_of("contains(list)"), "column 14: expected `,` and a second argument, found `)`");
    EXPECT_EQ(diagnosis_of("size(name)"), "column 1: no function named \"size\"");
    EXPECT_EQ(diagnosis_of("12ab"), "column 3: a number is directly followed by a letter");
    EXPECT_EQ(diagnosis_of("99999999999999999999"), "column 1: an integer above 18446744073709551615");
    EXPECT_EQ(diagnosis_of("name == \"abc"), "column 9: a string without its closing \"");
    EXPECT_EQ(diagnosis_of("name == $'a\\q'"),
              "column 12: no such escape: there are \\\\ \\\" \\' \\n \\r \\t, \\x01 to "
              "\\xFF, and \\u0001 to \\uFFFF without surrogates");
    EXPECT_EQ(diagnosis_of("count # 5"), "column 7: '#' has no meaning here");
    EXPECT_EQ(diagnosis_of("count \x02 5"), "column 7: the control character 0x02");
    EXPECT_EQ(diagnosis_of("count == $I"), "column 10: a $ that no quote follows");
    EXPECT_EQ(diagnosis_of("name =~ count"),
              "column 9: expected a regular expression as a string literal, found `count`");
    EXPECT_EQ(diagnosis_of("count =~ 'a'"),
              "column 7: a regular expression is searched for in a string, not an integer");
    EXPECT_EQ(diagnosis_of("name =~ 'a('"), "column 9: wrong regular expression: a ( that is never closed");
    EXPECT_EQ(diagnosis_of("name =~ '\\d'"),
              "column 9: wrong regular expression: a backslash before a character that has no special meaning");
}

TEST(a_diagnosis, tells_the_line_if_there_are_several)
{
    EXPECT_EQ(diagnosis_of("count == 5 and\n  Nmae == 3"), "line 2, column 3: no column named \"Nmae\"");
    EXPECT_EQ(diagnosis_of("Nmae == 3 and\ncount == 5"), "line 1, column 1: no column named \"Nmae\"");
    EXPECT_EQ(diagnosis_of("count ==\n\n"), "line 3, column 1: expected a value, found the end of the text");
}

TEST(a_diagnosis, counts_columns_in_characters)
{
    EXPECT_EQ(diagnosis_of("name == \"\xC3\xA4\xE2\x82\xAC\xF0\x9F\x98\x80\" && Nmae"),
              "column 18: no column named \"Nmae\"");
    EXPECT_EQ(diagnosis_of("n\xC3\xA4me"), "column 1: no column named \"n\xC3\xA4me\"");
}

TEST(a_diagnosis, shows_a_long_name_cut_between_characters)
{
    std::string name(59, 'a');
    name += "\xE2\x82\xAC";
    EXPECT_EQ(diagnosis_of(name + "bbbb"), "column 1: no column named \"" + std::string(59, 'a') + "\"");
    EXPECT_LT(diagnosis_of(std::string(100000, 'n')).size(), 200u);
}

TEST(a_diagnosis, is_empty_after_a_success_and_belongs_to_its_thread)
{
    EXPECT_NE(diagnosis_of("count >"), "");
    std::thread([] {
        EXPECT_STREQ(ku_expr_diagnosis_1(), "");
        EXPECT_EQ(diagnosis_of("Nmae"), "column 1: no column named \"Nmae\"");
    }).join();
    EXPECT_STREQ(ku_expr_diagnosis_1(), "column 8: expected a value, found the end of the text");
    EXPECT_EQ(small_row().evaluate("count > 1"), 1);
    EXPECT_STREQ(ku_expr_diagnosis_1(), "");
}

// ---- Texts ----

std::string repeated(const std::string & s, size_t times)
{
    std::string result;
    result.reserve(s.size() * times);
    for (size_t i = 0; i < times; i++)
        result += s;
    return result;
}

struct nesting {
    const char * p_open;
    const char * p_core;
    const char * p_close;
    int          expected; // of 250 levels
};

TEST(nesting, of_250_levels_is_accepted_and_of_251_refused)
{
    const nesting kinds[] = {{"(", "count", ")", 1},
                             {"!", "count", "", 1},
                             {"-", "count", "", 1},
                             {"+", "count", "", 1},
                             {"~", "count", "", 1},
                             {"list[", "0", "]", -KU_EXPR_E_NO_SUCH_ELEMENT},
                             {"lower(", "name", ")", -KU_EXPR_E_TYPES},
                             {"1 + (", "count", ")", 1},
                             {"1 in (", "1", ")", -KU_EXPR_E_SYNTAX},
                             {"1 * (0 | 5 - (", "count", "))", 0}};
    for (const nesting & kind : kinds) {
        const size_t levels = std::string(kind.p_open).size() > 10 ? 125 : 250;
        EXPECT_EQ(small_row().evaluate(repeated(kind.p_open, levels) + kind.p_core + repeated(kind.p_close, levels)),
                  kind.expected)
            << kind.p_open << ku_expr_diagnosis_1();
        const std::string deeper = repeated(kind.p_open, levels + 1) + kind.p_core + repeated(kind.p_close, levels + 1);
        const int         result = small_row().evaluate(deeper);
        EXPECT_TRUE(result == -KU_EXPR_E_TOO_LONG || result == kind.expected) << kind.p_open;
        if (std::string(kind.p_open) != "1 in (") {
            EXPECT_EQ(result, -KU_EXPR_E_TOO_LONG) << kind.p_open;
            EXPECT_NE(std::string(ku_expr_diagnosis_1()).find("nested deeper than 250 levels"), std::string::npos);
        }
    }
}

TEST(nesting, of_100000_levels_ends_at_the_251st)
{
    for (const char * p_open : {"(", "!", "-", "~", "list[", "lower(", "1 in ((", "1+(", "!(", "contains(tags,"}) {
        const std::string text = repeated(p_open, 100000);
        EXPECT_EQ(small_row().evaluate(text), -KU_EXPR_E_TOO_LONG) << p_open;
    }
}

TEST(nesting, as_deep_as_it_gets_needs_no_more_stack_than_there_is)
{
    // At each level a value waits for each kind of operator.
    std::string text = "1";
    for (int i = 0; i < 125; i++)
        text = "(0 == 1 | 2 + 3 * contains(list, " + text + "))";
    EXPECT_EQ(small_row().evaluate(text), 0);
    text = "1";
    for (int i = 0; i < 250; i++)
        text = "(0 < 1 | 2 + 3 * " + text + ")";
    EXPECT_EQ(small_row().evaluate(text), 1);
    text = "count";
    for (int i = 0; i < 250; i++)
        text = "(count > count | count + 0 * " + text + ")";
    EXPECT_EQ(small_row().evaluate(text), 0);
}

TEST(a_text, of_one_mib_is_accepted_and_a_longer_one_refused)
{
    const size_t longest = 1024 * 1024;
    EXPECT_EQ(small_row().evaluate(std::string(longest - 1, ' ') + "1"), 1);
    EXPECT_EQ(small_row().evaluate(std::string(longest, ' ') + "1"), -KU_EXPR_E_TOO_LONG);
    EXPECT_STREQ(ku_expr_diagnosis_1(), "column 1: the text is longer than 1 MiB");
    EXPECT_EQ(small_row().evaluate(std::string(8 * longest, '(')), -KU_EXPR_E_TOO_LONG);
}

TEST(a_text, of_operators_in_a_row_is_no_nesting)
{
    const size_t many = 100000;
    EXPECT_EQ(small_row().evaluate("count" + repeated("+count", many) + " == 500005"), 1);
    EXPECT_EQ(small_row().evaluate("count" + repeated("&&count", many)), 1);
    EXPECT_EQ(small_row().evaluate("0" + repeated("||!count", many)), 0);
    EXPECT_EQ(small_row().evaluate("0" + repeated("+1", many) + " == 100000"), 1);
    EXPECT_EQ(small_row().evaluate("5 in (0" + repeated(",count-5", many) + ",5)"), 1);
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&1", many)), 1);
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&name like 'a%'", 10000)), 1);
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&name like lower('A%')", 10000)), 1);
}

TEST(a_text, of_many_regular_expressions_is_bounded)
{
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&name=~'b'", 100)), 1);
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&name=~'b'", 80000)), -KU_EXPR_E_TOO_LONG);
    EXPECT_EQ(small_row().evaluate("1" + repeated("&&name=~'(.{9}a|.{9}b)*c'", 30000)), -KU_EXPR_E_TOO_LONG);
    EXPECT_EQ(small_row().evaluate("name =~ '" + repeated("a", 1000000) + "'"), -KU_EXPR_E_TOO_LONG);
    EXPECT_EQ(small_row().evaluate("name =~ '[" + repeated("ab", 500000) + "]'"), -KU_EXPR_E_TOO_LONG);
    EXPECT_EQ(small_row().evaluate("name =~ '" + repeated("(", 1000000) + "'"), -KU_EXPR_E_TOO_LONG);
    EXPECT_EQ(small_row().evaluate("name =~ 'a" + repeated("*", 1000000) + "'"), -KU_EXPR_E_TOO_LONG);
}

TEST(a_text, that_is_not_utf8_is_refused_where_it_goes_wrong)
{
    EXPECT_EQ(diagnosis_of("name == \"\xFF\""), "column 10: the byte 0xff, which isn't UTF-8 text");
    for (const char * p_bad : {"\x80", "\xC3", "\xC0\x80", "\xE2\x82", "\xED\xA0\x80", "\xF5\x80\x80\x80",
                               "\xE0\x80\x80", "\xF0\x80\x80\x80", "\xF4\x90\x80\x80", "\xC3\x28"}) {
        EXPECT_EQ(small_row().evaluate(std::string("name == '") + p_bad + "'"), -KU_EXPR_E_SYNTAX);
        EXPECT_EQ(small_row().evaluate(p_bad), -KU_EXPR_E_SYNTAX);
    }
}

TEST(a_text, cut_short_anywhere_gets_a_code_and_a_diagnosis)
{
    const std::string whole =
        "lower(name) not like $'\\u0061%' && (count + 0x1F) * -2.5e3 <> list[count - 5] || 'one' in "
        "tags and sd.l[0] =~ '[[:alpha:]]{1,2}(a|b)$' or data == \"0x7879\"";
    for (size_t length = 0; length <= whole.size(); length++) {
        void *           p_compiled = nullptr;
        const kt_int32_t rc         = small_row().compile(whole.substr(0, length), &p_compiled);
        EXPECT_GE(rc, 0);
        EXPECT_LE(rc, KU_EXPR_E_TOO_LONG);
        EXPECT_EQ(std::string(ku_expr_diagnosis_1()).empty(), rc == 0);
        ku_free_expr_1(p_compiled, 0);
    }
}

void expect_an_answer(const expr_row & row, const std::string & text)
{
    void *           p_compiled = nullptr;
    const kt_int32_t rc         = row.compile(text, &p_compiled);
    ASSERT_GE(rc, 0);
    ASSERT_LE(rc, KU_EXPR_E_TOO_LONG) << text;
    ASSERT_EQ(std::string(ku_expr_diagnosis_1()).empty(), rc == 0) << text;
    if (rc != 0)
        return;
    kt_uint32_t      result = 4711;
    const kt_int32_t run_rc = row.run(p_compiled, &result);
    ASSERT_TRUE(run_rc == 0 || (run_rc >= KU_EXPR_E_INTEGER_FAULT && run_rc <= KU_EXPR_E_DAMAGED_VALUE)) << text;
    ASSERT_EQ(result == 4711, run_rc != 0) << text;
    ku_free_expr_1(p_compiled, 0);
}

TEST(a_text, of_random_bytes_gets_a_code_and_a_diagnosis)
{
    std::mt19937   random(7);
    const expr_row row = small_row();
    for (int i = 0; i < 20000; i++) {
        std::string text;
        for (auto n = random() % 30; n > 0; n--)
            text += static_cast<char>(1 + random() % 255);
        expect_an_answer(row, text);
    }
}

TEST(a_text, of_random_tokens_gets_a_code_and_a_diagnosis)
{
    const char *   tokens[] = {"count",     "name",   "ratio",  "data",
                               "rh",        "list",   "tags",   "sd",
                               ".a",        ".s",     ".l",     "[",
                               "]",         "(",      ")",      ",",
                               "==",        "!=",     "<",      ">=",
                               "&&",        "||",     "!",      "and",
                               "or",        "not",    "in",     "like",
                               "=~",        "!~",     "'a%'",   "'0x01'",
                               "'(a|b)*'",  "5",      "0",      "1.5",
                               "-",         "+",      "*",      "/",
                               "%",         "&",      "^",      "|",
                               "~",         "length", "count(", "lower(",
                               "contains(", "inf",    "nan",    "18446744073709551615"};
    std::mt19937   random(8);
    const expr_row row = small_row();
    for (int i = 0; i < 40000; i++) {
        std::string text;
        for (auto n = random() % 12; n > 0; n--)
            text += std::string(tokens[random() % std::size(tokens)]) + " ";
        expect_an_answer(row, text);
    }
}

// ---- Rows ----

// A row with one string column whose item is these bytes.
expr_row string_row(const std::string & item)
{
    expr_row row;
    row.add("s", str("abc"));
    row.indirect() = item;
    row.slots().clear();
    append_word(row.slots(), 0);
    append_word(row.slots(), static_cast<std::uint32_t>(item.size()));
    return row;
}

TEST(a_damaged_row, a_string_without_a_terminator_is_found_out_by_every_operator)
{
    for (const char * p_text : {"s == 'abc'", "s != 'abc'", "s == 'x'", "s < 'b'", "s like 'a%'", "s like '%c'",
                                "s like '%b%'", "s like 'a_c'", "s =~ 'b'", "s in ('abc')", "length(s)",
                                "lower(s) == 'abc'", "s == s", "s like '%'", "s == ''"}) {
        EXPECT_EQ(string_row("abc").evaluate(p_text), -KU_EXPR_E_DAMAGED_VALUE) << p_text;
        EXPECT_EQ(string_row("").evaluate(p_text), -KU_EXPR_E_DAMAGED_VALUE) << p_text;
    }
}

TEST(a_damaged_row, a_string_ends_at_its_first_terminator)
{
    for (const std::string & item : {std::string("ab\0cd\0", 6), std::string("ab\0cd", 5)}) {
        EXPECT_EQ(string_row(item).evaluate("s == 'ab'"), 1);
        EXPECT_EQ(string_row(item).evaluate("length(s) == 2"), 1);
        EXPECT_EQ(string_row(item).evaluate("s like '%b'"), 1);
        EXPECT_EQ(string_row(item).evaluate("s like '%cd%'"), 0);
        EXPECT_EQ(string_row(item).evaluate("s like 'abc%'"), 0);
        EXPECT_EQ(string_row(item).evaluate("s =~ 'c'"), 0);
        EXPECT_EQ(string_row(item).evaluate("s > 'a' && s < 'abc'"), 1);
    }
}

TEST(a_damaged_row, bytes_that_are_no_characters_count_one_each)
{
    EXPECT_EQ(string_row(std::string("\xFF\xC3", 3)).evaluate("s like '__'"), 1);
    EXPECT_EQ(string_row(std::string("\xFF\xC3", 3)).evaluate("s like '_'"), 0);
    EXPECT_EQ(string_row(std::string("\xE2\x82", 3)).evaluate("s like '__'"), 1);
    EXPECT_EQ(string_row(std::string("a\xFFz", 4)).evaluate("s like 'a%z'"), 1);
    EXPECT_EQ(string_row(std::string("a\xFFz", 4)).evaluate("s =~ '^a.z$'"), 0); // a dot is a character
    EXPECT_EQ(string_row(std::string("a\xFFz", 4)).evaluate("s =~ 'z$'"), 1);
    EXPECT_EQ(string_row(std::string("\xFF", 2)).evaluate("s == $'\\xFF'"), 1);
}

TEST(a_damaged_row, an_item_outside_the_row_is_found_out)
{
    const std::pair<std::uint32_t, std::uint32_t> places[] = {
        {0, 5}, {1, 4}, {4, 1}, {0xFFFFFFFF, 1}, {0xFFFFFFFF, 0xFFFFFFFF}, {1, 0xFFFFFFFF}, {0x80000000, 0x80000000}};
    for (const auto & [offset, length] : places) {
        for (const auto & [type, p_text] :
             std::vector<std::pair<kt_data_type_t, const char *>>{{KT_CHAR_PTR, "s == 'abc'"},
                                                                  {KT_BINARY_PTR, "s == '0x01'"},
                                                                  {KT_RSRC_HANDLE_PTR, "s == '0x01'"},
                                                                  {KT_INT32_ARRAY, "count(s)"},
                                                                  {KT_SD_PTR, "count(s)"}}) {
            expr_row row;
            row.add("s", bytes_value(type, ""));
            row.indirect() = std::string("abc\0", 4);
            row.slots().clear();
            append_word(row.slots(), offset);
            append_word(row.slots(), length);
            EXPECT_EQ(row.evaluate(p_text), -KU_EXPR_E_DAMAGED_VALUE) << offset << " " << length << " " << p_text;
        }
    }
}

// The whole of small_row with one word of its indirect data replaced.
expr_row patched_row(size_t column, size_t offset_in_item, std::uint32_t word)
{
    expr_row      row  = small_row();
    std::uint32_t base = 0;
    std::memcpy(&base, row.slots().data() + column * 8, 4);
    std::memcpy(row.indirect().data() + base + offset_in_item, &word, 4);
    return row;
}

TEST(a_damaged_row, lengths_and_counts_that_leave_their_item_are_found_out)
{
    EXPECT_EQ(patched_row(3, 0, 3).evaluate("data == '0x7879'"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(3, 0, 0xFFFFFFFF).evaluate("length(data)"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(3, 0, 1).evaluate("data == '0x78'"), 1);
    EXPECT_EQ(patched_row(5, 0, 3).evaluate("count(list)"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(5, 0, 0x20000001).evaluate("list[0]"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(5, 0, 1).evaluate("2 in list"), 0);
    EXPECT_EQ(patched_row(6, 8, 4000).evaluate("'two' in tags"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(6, 8, 4000).evaluate("tags[1] == 'two'"), 1);
    EXPECT_EQ(patched_row(6, 16, 4000).evaluate("'one' in tags"), 1); // found before the damage
    EXPECT_EQ(patched_row(6, 12, 3).evaluate("tags[0] == 'one'"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(7, 0, 0x10000001).evaluate("sd.a"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(7, 8, KT_UINT32).evaluate("sd.a"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(7, 32, 4000).evaluate("sd.s == 'in'"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(patched_row(7, 0, 1).evaluate("sd.s == 'in'"), -KU_EXPR_E_NO_SUCH_ELEMENT);
    EXPECT_EQ(patched_row(7, 0, 1).evaluate("sd.a == 1"), 1);
}

TEST(a_damaged_row, random_damage_gives_an_answer_and_never_leaves_the_row)
{
    const char *        expressions[] = {"count > 3 && name like 'a%' && ratio < 1",
                                         "lower(name) =~ 'b' || data == '0x7879' || rh == '0x00'",
                                         "'two' in tags || tags[0] like '%n%' || contains(tags, name)",
                                         "sd.a == 1 && sd.s == 'in' || sd.l[0] == 1 || 1 in sd.l || count(sd) > 3",
                                         "list[0] + list[1] == 3 || count in list || length(tags[1]) > 2",
                                         "name == 'abc' || name < 'b' || name like '%c'"};
    std::mt19937        random(9);
    std::vector<void *> compiled;
    for (const char * p_text : expressions) {
        compiled.push_back(nullptr);
        ASSERT_EQ(small_row().compile(p_text, &compiled.back()), 0) << ku_expr_diagnosis_1();
    }
    for (int i = 0; i < 30000; i++) {
        expr_row row = small_row();
        for (auto n = 1 + random() % 4; n > 0; n--) {
            std::string & where = random() % 2 == 0 ? row.slots() : row.indirect();
            const size_t  at    = random() % (where.size() - 3);
            const auto    word  = static_cast<std::uint32_t>(random() % 3 == 0 ? random() : random() % 100);
            std::memcpy(where.data() + at, &word, random() % 2 == 0 ? 1 : 4);
        }
        if (random() % 4 == 0)
            row.indirect().resize(random() % row.indirect().size());
        kt_uint32_t      result = 4711;
        const kt_int32_t rc     = row.run(compiled[i % compiled.size()], &result);
        ASSERT_TRUE(rc == 0 || (rc >= KU_EXPR_E_INTEGER_FAULT && rc <= KU_EXPR_E_DAMAGED_VALUE));
    }
    for (void * p : compiled)
        ku_free_expr_1(p, 0);
}

TEST(a_row, with_fewer_slots_than_the_expression_reads_has_no_such_element)
{
    void * p_compiled = nullptr;
    ASSERT_EQ(small_row().compile("ratio < 1 || count", &p_compiled), 0);
    kt_uint32_t       result   = 4711;
    const std::string slots    = small_row().slots();
    const std::string indirect = small_row().indirect();
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, slots.data(), 2, &result, indirect.data()), KU_EXPR_E_NO_SUCH_ELEMENT);
    EXPECT_EQ(result, 4711u);
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, slots.data(), 3, &result, indirect.data()), 0);
    EXPECT_EQ(result, 1u);
    ku_free_expr_1(p_compiled, 0);
}

TEST(a_row, without_indirect_data_will_do_for_numbers)
{
    void * p_compiled = nullptr;
    ASSERT_EQ(small_row().compile("count == 5 || name == ''", &p_compiled), 0);
    kt_uint32_t       result = 4711;
    const std::string slots  = small_row().slots();
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, slots.data(), 8, &result, nullptr), 0);
    EXPECT_EQ(result, 1u);
    ku_free_expr_1(p_compiled, 0);
    ASSERT_EQ(small_row().compile("name == ''", &p_compiled), 0);
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, slots.data(), 8, &result, nullptr), KU_EXPR_E_DAMAGED_VALUE);
    ku_free_expr_1(p_compiled, 0);
    ASSERT_EQ(small_row().compile("1", &p_compiled), 0);
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, nullptr, 0, &result, nullptr), 0);
    ku_free_expr_1(p_compiled, 0);
}

TEST(null_arguments, are_refused)
{
    void *      p_compiled = nullptr;
    char        text[]     = "count";
    kt_uint32_t result     = 4711;
    expr_row    row        = small_row();
    EXPECT_EQ(ku_comp_expr_1(nullptr, 0, expr_row::answer, &row, &p_compiled), KU_EXPR_E_SYNTAX);
    EXPECT_STREQ(ku_expr_diagnosis_1(), "column 1: there is no text, callback or place for the result");
    EXPECT_EQ(ku_comp_expr_1(text, 0, nullptr, &row, &p_compiled), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_comp_expr_1(text, 0, expr_row::answer, &row, nullptr), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(p_compiled, nullptr);
    ASSERT_EQ(ku_comp_expr_1(text, 0, expr_row::answer, &row, &p_compiled), 0);
    EXPECT_EQ(ku_exec_expr_1(nullptr, 16, text, 8, &result, nullptr), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, nullptr, 8, &result, nullptr), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_exec_expr_1(p_compiled, 16, row.slots().data(), 8, nullptr, nullptr), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(result, 4711u);
    ku_free_expr_1(p_compiled, 0);
    ku_free_expr_1(nullptr, 0);
}

// ---- The callback ----

struct asked {
    std::string name;
    kt_uint32_t parent;
    bool        operator==(const asked &) const = default;
};

kt_int32_t note_question(void * p_token, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t parent_id,
                         ku_validate_data_t * p_data)
{
    EXPECT_EQ(std::strlen(p_name), length);
    static_cast<std::vector<asked> *>(p_token)->push_back({p_name, parent_id});
    *p_data = {static_cast<kt_data_type_t>(parent_id == 0xFFFFFFFF ? KT_SD_PTR : KT_INT32), 42};
    return 0;
}

TEST(the_callback, is_asked_for_columns_and_for_fields_with_their_column)
{
    std::vector<asked> questions;
    char               text[]     = "one.two == 1 && inf.and > three . four";
    void *             p_compiled = nullptr;
    ASSERT_EQ(ku_comp_expr_1(text, 0, note_question, &questions, &p_compiled), 0) << ku_expr_diagnosis_1();
    ku_free_expr_1(p_compiled, 0);
    const kt_uint32_t top = 0xFFFFFFFF;
    EXPECT_EQ(questions,
              (std::vector<asked>{{"one", top}, {"two", 42}, {"inf", top}, {"and", 42}, {"three", top}, {"four", 42}}));
}

TEST(the_callback, may_answer_with_any_type)
{
    for (kt_uint32_t type = 0; type < 300; type++) {
        char               text[]     = "x";
        void *             p_compiled = nullptr;
        static kt_uint32_t answer;
        answer              = type == 299 ? 0xFFFFFFFF : type;
        const kt_int32_t rc = ku_comp_expr_1(
            text, 0,
            [](void *, kt_char_t *, kt_uint32_t, kt_uint32_t, ku_validate_data_t * p_data) {
                *p_data = {answer, 0};
                return kt_int32_t{0};
            },
            nullptr, &p_compiled);
        EXPECT_EQ(rc, type >= KT_INT32 && type <= KT_FLOAT64 ? 0 : KU_EXPR_E_TYPES) << type;
        ku_free_expr_1(p_compiled, 0);
    }
}

// ---- Time and memory ----

TEST(patterns, of_the_language_cannot_run_away)
{
    expr_row row;
    row.add("s", str(std::string(20000, 'a')));
    row.add("t", str(repeated("ab", 10000)));
    EXPECT_EQ(row.evaluate("s like '" + repeated("%a", 50) + "%b'"), 0);
    EXPECT_EQ(row.evaluate("s like '" + repeated("%a", 50) + "%'"), 1);
    EXPECT_EQ(row.evaluate("s like '%" + repeated("_%", 100) + "b'"), 0);
    EXPECT_EQ(row.evaluate("t like '%" + repeated("ab", 200) + "b%'"), 0);
    EXPECT_EQ(row.evaluate("lower(s) like lower('" + repeated("%A", 50) + "%B')"), 0);
    EXPECT_EQ(row.evaluate("s =~ '(a*)*b'"), 0);
    EXPECT_EQ(row.evaluate("s =~ '(a|a)*b'"), 0);
    EXPECT_EQ(row.evaluate("s =~ '^(a|aa)+$'"), 1);
    EXPECT_EQ(row.evaluate("s =~ '(a?){60}a{60}b'"), 0);
    EXPECT_EQ(row.evaluate("t =~ '(a|b)*a(a|b){100}c'"), 0);
    EXPECT_EQ(row.evaluate("t =~ '(a|b)*b(a|b){99}$'"), 0);
    EXPECT_EQ(row.evaluate("t =~ '(a|b)*a(a|b){99}$'"), 1);
}

TEST(running, allocates_nothing)
{
    expr_row row        = small_row();
    void *   p_compiled = nullptr;
    ASSERT_EQ(
        row.compile("lower(name) =~ '^(a|b|c)+$' && name like '%b_' && 'two' in tags && sd.s == 'in' && list[1] == "
                    "2 && name =~ '(a|b)*b(a|b|c){0,30}$' && data == '0x7879' && upper(tags[0]) == 'ONE'",
                    &p_compiled),
        0);
    const std::string    slots = row.slots(), indirect = row.indirect();
    kt_uint32_t          result = 0;
    kt_test::fault_scope scope;
    EXPECT_EQ(ku_exec_expr_within_1(p_compiled, 16, slots.data(), 8, &result, indirect.data(),
                                    static_cast<kt_uint32_t>(indirect.size())),
              0);
    EXPECT_EQ(kt_test::calls_made(kt_test::call::allocation), 0u);
    EXPECT_EQ(result, 1u);
    ku_free_expr_1(p_compiled, 0);
}

TEST(compiling, reports_each_failing_allocation)
{
    char text[] =
        "lower(name) like 'a%' && name like '%b%' && name =~ '[[:alpha:]]+(x|y){2,3}' && data == '0x01' && sd.a "
        "in (1, 2.5, count) && count > 3";
    expr_row             row = small_row();
    kt_test::fault_scope scope;
    for (unsigned nth = 1;; nth++) {
        void * p_compiled = nullptr;
        kt_test::fail_call(kt_test::call::allocation, nth, ENOMEM);
        const kt_int32_t rc     = ku_comp_expr_1(text, 0, expr_row::answer, &row, &p_compiled);
        const bool       failed = kt_test::failed_as_asked(kt_test::call::allocation);
        kt_test::reset_calls();
        if (!failed) {
            EXPECT_EQ(rc, 0);
            EXPECT_GT(nth, 10u);
            ku_free_expr_1(p_compiled, 0);
            break;
        }
        ASSERT_EQ(rc, KU_EXPR_E_NO_MEMORY) << nth;
        EXPECT_EQ(p_compiled, nullptr);
        EXPECT_NE(std::string(ku_expr_diagnosis_1()).find("there is no memory"), std::string::npos);
    }
}

TEST(threads_selection, several_threads_run_one_expression_and_compile_their_own)
{
    const expr_row row        = small_row();
    void *         p_compiled = nullptr;
    ASSERT_EQ(row.compile("count > 3 && name =~ '^a' && 'two' in tags", &p_compiled), 0);
    std::vector<std::thread> threads;
    for (int i = 0; i < 6; i++) {
        threads.emplace_back([&row, p_compiled, i] {
            for (int round = 0; round < 300; round++) {
                kt_uint32_t result = 0;
                EXPECT_EQ(row.run(p_compiled, &result), 0);
                EXPECT_EQ(result, 1u);
                const std::string wrong = "wrong" + std::to_string(i);
                EXPECT_EQ(row.evaluate(wrong), -KU_EXPR_E_NO_SUCH_NAME);
                EXPECT_EQ(ku_expr_diagnosis_1(), "column 1: no column named \"" + wrong + "\"");
            }
        });
    }
    for (std::thread & t : threads)
        t.join();
    ku_free_expr_1(p_compiled, 0);
}

} // namespace
