// SPDX-License-Identifier: MIT
// The manual of the selection language must be true: every example in docs/SELECTION.md is run.
#include <gtest/gtest.h>

#include <fstream>
#include <string>
#include <vector>

#include "expr_rows.h"
#include "kt_ku.h"

namespace
{

using namespace kt_test;

// The row that the manual describes.
expr_row manual_row()
{
    expr_row r;
    r.add("count", i32(5));
    r.add("debt", i64(-7));
    r.add("flags", u32(6));
    r.add("total", u64(18446744073709551615u));
    r.add("ratio", f64(0.25));
    r.add("weight", f32(0.1f));
    r.add("name", str("Caf\xC3\xA9 au lait"));
    r.add("path", str("/tmp/100%_sure"));
    r.add("data", bin("\x0A\x1F"));
    r.add("owner", handle({0x00021234, {1, 2, 3, 4}}));
    r.add("sizes", array(KT_INT32_ARRAY, {i32(10), i32(20), i32(30)}));
    r.add("tags", array(KT_CHAR_PTR_ARRAY, {str("red"), str("green")}));
    r.add("origin", structure({{"host", str("db1")}, {"port", u32(5432)}}));
    r.add("hops", array(KT_SD_PTR_ARRAY, {structure({{"ms", i32(3)}}), structure({{"ms", i32(9)}})}));
    return r;
}

struct example {
    int         line;
    std::string text;
    std::string outcome;
};

std::string trimmed(const std::string & s)
{
    const size_t first = s.find_first_not_of(' ');
    return first == std::string::npos ? "" : s.substr(first, s.find_last_not_of(' ') - first + 1);
}

// The lines of the blocks that are marked as examples, cut at their last "->".
std::vector<example> examples_of_the_manual()
{
    std::ifstream        in(KT_SOURCE_DIR "/docs/SELECTION.md");
    std::vector<example> result;
    std::string          line;
    bool                 inside = false;
    for (int number = 1; std::getline(in, line); number++) {
        if (line.rfind("```", 0) == 0) {
            inside = line == "```selection";
            continue;
        }
        const size_t arrow = line.rfind("->");
        if (inside && !trimmed(line).empty()) {
            EXPECT_NE(arrow, std::string::npos) << "line " << number;
            result.push_back({number, trimmed(line.substr(0, arrow)), trimmed(line.substr(arrow + 2))});
        }
    }
    return result;
}

std::string outcome_of(const expr_row & row, const std::string & text)
{
    const int result = row.evaluate(text);
    if (result >= 0)
        return result == 1 ? "true" : "false";
    return (result <= -KU_EXPR_E_INTEGER_FAULT ? "fault " : "refused ") + std::to_string(-result);
}

TEST(the_manual, every_example_comes_out_as_it_says)
{
    const std::vector<example> examples = examples_of_the_manual();
    EXPECT_GT(examples.size(), 100u);
    const expr_row row = manual_row();
    for (const example & e : examples)
        EXPECT_EQ(outcome_of(row, e.text), e.outcome) << "docs/SELECTION.md:" << e.line << ": " << e.text << "\n"
                                                      << ku_expr_diagnosis_1();
}

// As the manual recommends it for strings from outside.
std::string quoted(const std::string & text)
{
    std::string result = "$\"";
    for (const char character : text) {
        const auto c = static_cast<unsigned char>(character);
        char       escape[8];
        if (c < ' ' || c == '$' || c == 127)
            std::snprintf(escape, sizeof escape, "\\x%02x", c);
        else
            std::snprintf(escape, sizeof escape, c == '\\' || c == '"' ? "\\%c" : "%c", c);
        result += escape;
    }
    return result + "\"";
}

TEST(the_manual, its_way_to_quote_a_foreign_string_is_safe)
{
    for (const std::string & text :
         {std::string("x\" || \"\" == \""), std::string("\\"), std::string("\\\""), std::string("$s $$ $\""),
          std::string("\x01\x1F\x7F\n\r\t"), std::string("caf\xC3\xA9"), std::string("'\"`"), std::string("")}) {
        expr_row row;
        row.add("s", str(text));
        EXPECT_EQ(row.evaluate("s == " + quoted(text)), 1) << text;
        EXPECT_EQ(quoted(text).find('$', 1), std::string::npos); // no variable inside
        expr_row other;
        other.add("s", str(text + "x"));
        EXPECT_EQ(other.evaluate("s == " + quoted(text)), 0) << text;
    }
}

} // namespace
