// SPDX-License-Identifier: MIT
// The selection language on many rows at once: each row is judged as it is alone. And lists of constants of any length,
// which are searched and not walked through.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "expr_rows.h"
#include "kt_ku.h"
#include "support/faults.h"

namespace
{

using namespace kt_test;

using random_t = std::mt19937_64;

unsigned below(random_t & random, unsigned n)
{
    return static_cast<unsigned>(random() % n);
}

template <class Choices> auto one_of(random_t & random, const Choices & choices)
{
    return choices[below(random, static_cast<unsigned>(std::size(choices)))];
}

// ---- Rows of every type, with values that meet often ----

const char * const Words[]   = {"", "a", "ab", "abc", "abd", "abcdefgh", "abcdefghi", "xbc", "bcdefghia", "\xC3\xA9"};
const double       Numbers[] = {
          0.0, -0.0, 0.5, 1, 2, 3, -1, 1e300, std::numeric_limits<double>::infinity(), -1e300, 9007199254740992.0};

expr_row some_row(random_t & random)
{
    const auto integer = [&] { return static_cast<std::int64_t>(below(random, 8)) - 3; };
    const auto number  = [&] { return below(random, 9) == 0 ? std::nan("") : one_of(random, Numbers); };
    expr_row   row;
    row.add("i", i32(static_cast<std::int32_t>(integer())));
    row.add("u", u32(static_cast<std::uint32_t>(integer())));
    row.add("l", i64(integer()));
    row.add("v", u64(static_cast<std::uint64_t>(integer())));
    row.add("f", f32(static_cast<float>(number())));
    row.add("d", f64(number()));
    row.add("s", str(one_of(random, Words)));
    row.add("t", str(one_of(random, Words)));
    row.add("b", bin("xy"));
    row.add("a", array(KT_INT32_ARRAY, {i32(1), i32(2)}));
    return row;
}

// Every third row, or so, has a value that isn't well formed.
void damage(random_t & random, expr_row & row)
{
    std::string & where = below(random, 2) == 0 ? row.slots() : row.indirect();
    if (below(random, 3) == 0)
        where[below(random, static_cast<unsigned>(where.size()))] = static_cast<char>(random());
}

// ---- Conditions ----

std::string some_number(random_t & random)
{
    return one_of(random, std::array{"0", "1", "2", "-1", "-3", "0.5", "2.5", "nan", "inf", "4294967295",
                                     "18446744073709551615", "1e300", "9007199254740993", "-9223372036854775808"});
}

std::string some_text(random_t & random)
{
    return "'" + std::string(one_of(random, Words)) + "'";
}

std::string some_list(random_t & random, std::string (*some)(random_t &))
{
    std::string list = some(random);
    for (unsigned n = below(random, 12); n > 0; n--)
        list += "," + some(random);
    return std::string(one_of(random, std::array{" in (", " not in ("})) + list + ")";
}

std::string some_test(random_t & random)
{
    constexpr std::array relations{"==", "!=", "<", "<=", ">", ">="};
    constexpr std::array numbers{"i", "u", "l", "v", "f", "d"};
    constexpr std::array patterns{"'ab%'", "'%c'", "'%b%'", "'a_c'", "'%'", "''", "'abcdefgh%'", "'%bcdefghi%'"};
    constexpr std::array others{
        "1 / i > 0", "i + u > 1", "lower(s) == 'abc'", "s < t", "1 in a",  "a[i] == 1", "s =~ 'b'", "1", "0",
        "i",         "d",         "b == '0x7879'",     "nan",   "s like t"};
    const std::string text = one_of(random, std::array{"s", "t"});
    switch (below(random, 6)) {
    case 0:
    case 1:
        return std::string(one_of(random, numbers)) + one_of(random, relations) + some_number(random);
    case 2:
        return text + one_of(random, relations) + some_text(random);
    case 3:
        return text + one_of(random, std::array{" like ", " not like "}) + one_of(random, patterns);
    case 4:
        return below(random, 3) == 0 ? text + some_list(random, some_text)
                                     : one_of(random, numbers) + some_list(random, some_number);
    default:
        return one_of(random, others);
    }
}

std::string some_condition(random_t & random, unsigned depth)
{
    if (depth == 0 || below(random, 4) == 0)
        return (below(random, 6) == 0 ? "!" : "") + some_test(random);
    const std::string its_operator = one_of(random, std::array{" && ", " || "});
    std::string       result;
    for (unsigned n = 1 + below(random, 4); n > 0; n--) {
        const std::string part = some_condition(random, depth - 1);
        result += (result.empty() ? "" : its_operator) + (below(random, 4) == 0 ? "(" + part + ")" : part);
    }
    return result;
}

class compiled
{
  public:
    compiled(const expr_row & row, const std::string & text)
    {
        EXPECT_EQ(row.compile(text, &p_), 0) << text << "\n" << ku_expr_diagnosis_1();
    }
    ~compiled() { ku_free_expr_1(p_, 0); }
    compiled(const compiled &)             = delete;
    compiled & operator=(const compiled &) = delete;
    void *     get() const { return p_; }

  private:
    void * p_ = nullptr;
};

// ---- Rows together and alone ----

void compare_together_with_alone(std::uint64_t seed)
{
    random_t    random(seed);
    kt_uint64_t matches = 0, questions = 0;
    for (int round = 0; round < 60; round++) {
        std::vector<expr_row> rows;
        for (int i = 0; i < 64; i++) {
            rows.push_back(some_row(random));
            damage(random, rows.back());
        }
        std::vector<expr_row::record> records(rows.begin(), rows.end());
        const ku_row_form_t           whole_form = rows[0].form();
        for (int i = 0; i < 40; i++) {
            const std::string text = some_condition(random, below(random, 4));
            const compiled    expression(rows[0], text);
            kt_uint64_t       asked = random(), expected = 0, matching = 4711;
            if (i % 4 == 0)
                asked &= random() & random();
            const void * addresses[64] = {};
            for (size_t bit = 0; bit < 64; bit++) {
                if ((asked >> bit & 1) == 0)
                    continue;
                addresses[bit]      = records[bit].address();
                kt_uint32_t result  = 0;
                const bool  is_true = rows[bit].run_alone(expression.get(), &result) == 0 && result == 1;
                expected |= static_cast<kt_uint64_t>(is_true) << bit;
                questions++;
                matches += is_true ? 1 : 0;
            }
            ASSERT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &whole_form, addresses, asked, &matching), 0);
            ASSERT_EQ(matching, expected) << "seed " << seed << ": " << text;
        }
    }
    EXPECT_GT(matches, questions / 5);
    EXPECT_LT(matches, questions * 4 / 5);
}

TEST(rows_together, are_judged_as_each_one_alone_1)
{
    compare_together_with_alone(1);
}

TEST(rows_together, are_judged_as_each_one_alone_2)
{
    compare_together_with_alone(2);
}

TEST(rows_together, a_damaged_value_takes_only_its_own_row_out)
{
    std::vector<expr_row> rows(3);
    for (expr_row & row : rows) {
        row.add("count", i32(5));
        row.add("name", str("abc"));
    }
    rows[1].indirect().back() = 'x'; // the terminator
    const expr_row::record first(rows[0]), damaged(rows[1]), last(rows[2]);
    const void * const     addresses[] = {first.address(), damaged.address(), last.address()};
    const ku_row_form_t    form        = rows[0].form();
    const auto             matching    = [&](const std::string & text) {
        const compiled expression(rows[0], text);
        kt_uint64_t    result = 4711;
        EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &form, addresses, 7, &result), 0);
        return result;
    };
    EXPECT_EQ(matching("name == 'abc'"), 5u);
    EXPECT_EQ(matching("name != 'abc'"), 0u);
    EXPECT_EQ(matching("name != 'x'"), 5u);
    EXPECT_EQ(matching("name not in ('x', 'y')"), 5u);
    EXPECT_EQ(matching("!(name == 'x')"), 5u);
    EXPECT_EQ(matching("name == 'x' || count == 5"), 5u);
    EXPECT_EQ(matching("count == 5 || name == 'x'"), 7u); // not evaluated, so it can't fault
    EXPECT_EQ(matching("count == 6 && name == 'abc'"), 0u);
    EXPECT_EQ(matching("count == 5 && name like 'ab%' && count < 9"), 5u);
}

TEST(rows_together, with_fewer_slots_than_the_expression_reads_match_nothing)
{
    expr_row row;
    row.add("count", i32(5));
    row.add("ratio", f64(0.5));
    const expr_row::record record(row);
    const void * const     addresses[] = {record.address()};
    ku_row_form_t          form        = row.form();
    const compiled         both(row, "count == 5 || ratio < 1");
    kt_uint64_t            matching = 4711;
    EXPECT_EQ(ku_exec_expr_on_rows_1(both.get(), 16, &form, addresses, 1, &matching), 0);
    EXPECT_EQ(matching, 1u);
    form.total_values = 1;
    EXPECT_EQ(ku_exec_expr_on_rows_1(both.get(), 16, &form, addresses, 1, &matching), 0);
    EXPECT_EQ(matching, 0u);
}

TEST(rows_together, whose_length_is_below_the_excess_have_no_indirect_data)
{
    expr_row row;
    row.add("name", str("abc"));
    row.add("count", i32(5));
    const expr_row::record record(row);
    const void * const     addresses[] = {record.address()};
    ku_row_form_t          form        = row.form();
    form.length_excess                 = 1000;
    kt_uint64_t    matching            = 4711;
    const compiled of_string(row, "name == 'abc'"), of_number(row, "count == 5");
    EXPECT_EQ(ku_exec_expr_on_rows_1(of_string.get(), 16, &form, addresses, 1, &matching), 0);
    EXPECT_EQ(matching, 0u);
    EXPECT_EQ(ku_exec_expr_on_rows_1(of_number.get(), 16, &form, addresses, 1, &matching), 0);
    EXPECT_EQ(matching, 1u);
}

TEST(rows_together, null_arguments_are_refused_and_no_rows_are_none)
{
    expr_row row;
    row.add("count", i32(5));
    const compiled      expression(row, "count == 5 || 1");
    const ku_row_form_t form        = row.form();
    const void * const  addresses[] = {nullptr};
    kt_uint64_t         matching    = 4711;
    EXPECT_EQ(ku_exec_expr_on_rows_1(nullptr, 16, &form, addresses, 0, &matching), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, nullptr, addresses, 0, &matching), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &form, nullptr, 0, &matching), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &form, addresses, 0, nullptr), KU_EXPR_E_SYNTAX);
    EXPECT_EQ(matching, 4711u);
    EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &form, addresses, 0, &matching), 0);
    EXPECT_EQ(matching, 0u);
}

TEST(rows_together, are_run_without_an_allocation)
{
    random_t               random(1);
    const expr_row         row = some_row(random);
    const expr_row::record record(row);
    const void * const     addresses[] = {record.address()};
    const ku_row_form_t    form        = row.form();
    const compiled         expression(row, "i > -9 && s in ('a', 'b', 'c', 's') || lower(t) like '%b%' && d / i != 3");
    kt_uint64_t            matching = 0;
    fault_scope            scope;
    EXPECT_EQ(ku_exec_expr_on_rows_1(expression.get(), 16, &form, addresses, 1, &matching), 0);
    EXPECT_EQ(calls_made(call::allocation), 0u);
}

// ---- Lists ----

std::string listed(const std::vector<std::string> & elements)
{
    std::string list;
    for (const std::string & element : elements)
        list += (list.empty() ? "" : ", ") + element;
    return "(" + list + ")";
}

int evaluate(const stored_value & value, const std::string & test)
{
    expr_row row;
    row.add("x", value);
    return row.evaluate(test);
}

TEST(a_list, of_numbers_has_those_that_equal_an_element_in_any_type)
{
    const std::vector<std::string> mixed = {"7",    "-1",  "nan",         "2.0", "2.5",  "4294967295",
                                            "1e30", "inf", "-2147483648", "0.1", "-0.0", "9007199254740993"};
    const auto in = [&](const stored_value & value) { return evaluate(value, "x in " + listed(mixed)); };
    EXPECT_EQ(in(i32(7)), 1);
    EXPECT_EQ(in(i32(-1)), 1);
    EXPECT_EQ(in(i32(2)), 1);
    EXPECT_EQ(in(i32(0)), 1);
    EXPECT_EQ(in(i32(INT32_MIN)), 1);
    EXPECT_EQ(in(i32(3)), 0);
    EXPECT_EQ(in(u32(UINT32_MAX)), 1); // equal to 4294967295 and not to -1
    EXPECT_EQ(in(u32(7)), 1);
    EXPECT_EQ(in(u32(0x80000000)), 0);
    EXPECT_EQ(in(i64(4294967295)), 1);
    EXPECT_EQ(in(i64(-1)), 1);
    EXPECT_EQ(in(i64(9007199254740993)), 1);
    EXPECT_EQ(in(i64(9007199254740992)), 0);
    EXPECT_EQ(in(u64(UINT64_MAX)), 0);
    EXPECT_EQ(in(u64(9007199254740993)), 1);
    EXPECT_EQ(in(f32(2.5f)), 1);
    EXPECT_EQ(in(f32(0.1f)), 0); // a float32 counts with its own value
    EXPECT_EQ(in(f32(-0.0f)), 1);
    EXPECT_EQ(in(f64(0.1)), 1);
    EXPECT_EQ(in(f64(0.0)), 1);
    EXPECT_EQ(in(f64(1e30)), 1);
    EXPECT_EQ(in(f64(std::nan(""))), 0);
    EXPECT_EQ(in(f64(std::numeric_limits<double>::infinity())), 1);
    EXPECT_EQ(in(f64(-std::numeric_limits<double>::infinity())), 0);
    EXPECT_EQ(in(f64(9007199254740992.0)), 0);
    EXPECT_EQ(in(f64(9007199254740994.0)), 0);
}

TEST(a_list, whose_elements_no_value_of_the_column_equals_has_none)
{
    for (const stored_value & value : {i32(0), u32(0), i64(0), u64(0)}) {
        EXPECT_EQ(evaluate(value, "x in (nan, 0.5, 1e300, -inf)"), 0);
        EXPECT_EQ(evaluate(value, "x not in (nan, 0.5, 1e300, -inf)"), 1);
        EXPECT_EQ(evaluate(value, "(x in (nan, 0.5)) == 0 && x == 0"), 1);
    }
    for (const stored_value & value : {f32(0), f64(std::nan(""))}) {
        EXPECT_EQ(evaluate(value, "x in (nan, 9007199254740993)"), 0);
        EXPECT_EQ(evaluate(value, "x not in (nan, 9007199254740993)"), 1);
    }
}

// Lists of n elements 0, 3, 6 and so on, in an order of their own.
template <class Make> void look_up_multiples(size_t n, Make make_value, const char * p_prefix, const char * p_suffix)
{
    std::vector<std::string> elements;
    for (size_t i = 0; i < n; i++)
        elements.push_back(p_prefix + std::to_string(3 * (i * 7919 % n)) + p_suffix);
    expr_row row;
    row.add("x", make_value(0));
    const compiled in(row, "x in " + listed(elements)), not_in(row, "x not in " + listed(elements));
    const size_t   step = n > 100 ? n / 10 : 1;
    for (size_t i = 0; i < 3 * n + 3; i += step) {
        expr_row one;
        one.add("x", make_value(i));
        kt_uint32_t result = 4711;
        ASSERT_EQ(one.run(in.get(), &result), 0);
        ASSERT_EQ(result, i % 3 == 0 && i < 3 * n ? 1u : 0u) << n << " " << i;
        ASSERT_EQ(one.run(not_in.get(), &result), 0);
        ASSERT_EQ(result, i % 3 == 0 && i < 3 * n ? 0u : 1u) << n << " " << i;
    }
}

TEST(a_list, of_any_length_has_exactly_its_elements)
{
    // 7919 is a prime, so that each multiple comes once.
    for (const size_t n : {1, 2, 3, 4, 5, 6, 7, 8, 9, 15, 16, 17, 31, 33, 63, 64, 65, 100, 1000, 60000}) {
        look_up_multiples(
            n, [](size_t i) { return i32(static_cast<std::int32_t>(i)); }, "", "");
        look_up_multiples(
            n, [](size_t i) { return u64(i); }, "", "");
        look_up_multiples(
            n, [](size_t i) { return f64(static_cast<double>(i)); }, "", ".0");
        look_up_multiples(
            n, [](size_t i) { return str("name-" + std::to_string(i)); }, "'name-", "'");
    }
}

TEST(a_list, of_strings_tells_apart_what_begins_or_ends_alike)
{
    const std::string list = "x in ('', 'a', 'abcdefgh', 'abcdefghi', 'b\\', 'abcdefghijklmnopqrstuvwxyz')";
    for (const char * p : {"", "a", "abcdefgh", "abcdefghi", "b\\", "abcdefghijklmnopqrstuvwxyz"})
        EXPECT_EQ(evaluate(str(p), list), 1) << p;
    for (const char * p : {"A", "aa", "b", "abcdefg", "abcdefghj", "abcdefghii", "xbcdefgh",
                           "abcdefghijklmnopqrstuvwxy", "abcdefghijklmnopqrstuvwxy_", "abcdefghijklmnopqrstuvwxyzz"})
        EXPECT_EQ(evaluate(str(p), list), 0) << p;
}

TEST(a_list, may_repeat_an_element)
{
    EXPECT_EQ(evaluate(i32(5), "x in (5, 5, 5, 3, 3)"), 1);
    EXPECT_EQ(evaluate(i32(4), "x in (5, 5, 5, 3, 3)"), 0);
    EXPECT_EQ(evaluate(str("b"), "x in ('a', 'a', 'b', 'b')"), 1);
    EXPECT_EQ(evaluate(str("c"), "x in ('a', 'a', 'b', 'b')"), 0);
    EXPECT_EQ(evaluate(f64(0), "x in (0.0, -0.0, 0)"), 1);
}

TEST(a_list, of_constants_and_others_is_looked_at_from_left_to_right)
{
    EXPECT_EQ(evaluate(i32(5), "x in (1, 5, 1 / 0)"), 1);
    EXPECT_EQ(evaluate(i32(5), "x in (1, 1 / 0, 5)"), -KU_EXPR_E_INTEGER_FAULT);
    EXPECT_EQ(evaluate(i32(5), "x in (1, x, 1 / 0)"), 1);
    EXPECT_EQ(evaluate(i32(5), "x in (1, (0 || x) + 4, 1 / 0)"), 1);
    EXPECT_EQ(evaluate(i32(5), "x in ((1 || (x || x)), 5)"), 1);
    EXPECT_EQ(evaluate(i32(5), "x in ((0 && (x && x)), 2 + 3)"), 1);
}

TEST(a_list, is_a_truth_value_like_any_other)
{
    EXPECT_EQ(evaluate(i32(5), "(x in (5, 6)) + (x in (1, 5)) == 2"), 1);
    EXPECT_EQ(evaluate(i32(5), "!(x in (5, 6)) || x in (5)"), 1);
    EXPECT_EQ(evaluate(i32(5), "!!(x not in (5, 6))"), 0);
    EXPECT_EQ(evaluate(i32(5), "x in (5, 6) && x in (6, 7) || x in (4, 5)"), 1);
    EXPECT_EQ(evaluate(i32(5), "(x in (1, 2)) in (0, 7)"), 1);
    EXPECT_EQ(evaluate(i32(5), "1 || x in (1, 2)"), 1);
    EXPECT_EQ(evaluate(i32(5), "x in (1, 2) && 0 || x in (5, 8)"), 1);
}

TEST(a_list, of_constants_finds_a_damaged_string_out)
{
    expr_row row;
    row.add("x", str("abc"));
    row.indirect().back() = 'd';
    EXPECT_EQ(row.evaluate("x in ('abc', 'abcd')"), -KU_EXPR_E_DAMAGED_VALUE);
    EXPECT_EQ(row.evaluate("x not in ('abc')"), -KU_EXPR_E_DAMAGED_VALUE);
    row.slots()[4] = 0; // no bytes at all
    EXPECT_EQ(row.evaluate("x in ('', 'a')"), -KU_EXPR_E_DAMAGED_VALUE);
}

TEST(a_list, reports_each_failing_allocation)
{
    expr_row row;
    row.add("x", i32(5));
    row.add("s", str("a"));
    std::vector<std::string> numbers, strings;
    for (int i = 0; i < 300; i++) {
        numbers.push_back(std::to_string(i));
        strings.push_back("'" + std::to_string(i) + "'");
    }
    const std::string text = "x in " + listed(numbers) + " && s not in " + listed(strings);
    fault_scope       scope;
    for (unsigned nth = 1;; nth++) {
        void * p_compiled = nullptr;
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc     = row.compile(text, &p_compiled);
        const bool       failed = failed_as_asked(call::allocation);
        reset_calls();
        ASSERT_EQ(rc, failed ? KU_EXPR_E_NO_MEMORY : 0);
        ASSERT_EQ(p_compiled == nullptr, failed);
        ku_free_expr_1(p_compiled, 0);
        if (!failed) {
            EXPECT_GT(nth, 5u);
            break;
        }
    }
}

} // namespace
