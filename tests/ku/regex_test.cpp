// SPDX-License-Identifier: MIT
// The regular expressions of the selection language: their two automata must agree.
#include <gtest/gtest.h>

#include <random>
#include <string>

#include "../../support/ku/ku_regex.h"

namespace
{

class compiled
{
  public:
    compiled(const std::string & pattern, uint32_t work)
    {
        ku_expr_trouble_t trouble = {};
        rc_ = ku_regex_compile(reinterpret_cast<const uint8_t *>(pattern.data()), pattern.size(), "", &work, &bytes_,
                               &offset_, &trouble);
    }
    kt_int32_t                 rc() const { return rc_; }
    const ku_regex_program_t & program() const
    {
        return *reinterpret_cast<const ku_regex_program_t *>(bytes_.data() + offset_);
    }
    bool finds(const std::string & text, ku_letters_t letters = KU_LETTERS_AS_THEY_ARE) const
    {
        return ku_regex_is_found(program(), {reinterpret_cast<const uint8_t *>(text.data()), text.size(), letters});
    }

  private:
    kt_int32_t           rc_;
    ku_growable<uint8_t> bytes_;
    kt_uint32_t          offset_ = 0;
};

constexpr uint32_t too_little_for_a_table = ku_regex_work / 2;

TEST(regular_expressions, with_a_table_and_without_find_the_same)
{
    const char * patterns[] = {"a",
                               "",
                               "^",
                               "$",
                               "^$",
                               "$^",
                               "a|^b|c$",
                               "(^a|b$)+",
                               "^(ab|a)(bc|c)?$",
                               "a{2,3}b",
                               "(a*b*)*c",
                               "[^a]",
                               "^[^a]*$",
                               "\xC3\xA9",
                               "[\xC3\xA0-\xC3\xBF]b",
                               "[^\xC3\xA9]$",
                               "^...$",
                               ".a.",
                               "(a|b)*a(a|b)(a|b)",
                               "()|a",
                               "x*",
                               "(a|b|)c",
                               "[[:space:][:digit:]]",
                               "[]^-]",
                               "a$b",
                               "a^b",
                               "\\.|\\[|\\\\"};
    std::mt19937 random(3);
    const char * pieces[] = {"a", "b", "c", "\xC3\xA9", "\xE2\x82\xAC", "\xFF", "\xC3", " ", "1", ".", "]", "A"};
    for (const char * p_pattern : patterns) {
        const compiled table(p_pattern, ku_regex_work), threads(p_pattern, too_little_for_a_table);
        ASSERT_EQ(table.rc(), 0) << p_pattern;
        ASSERT_EQ(threads.rc(), 0) << p_pattern;
        EXPECT_NE(table.program().state_count, 0) << p_pattern;
        EXPECT_EQ(threads.program().state_count, 0) << p_pattern;
        for (int i = 0; i < 300; i++) {
            std::string text;
            for (auto n = random() % 7; n > 0; n--)
                text += pieces[random() % std::size(pieces)];
            const auto letters = static_cast<ku_letters_t>(random() % 3);
            EXPECT_EQ(table.finds(text, letters), threads.finds(text, letters)) << p_pattern << " in " << text;
        }
    }
}

TEST(regular_expressions, too_many_states_for_a_table_are_run_as_threads)
{
    const compiled c("(a|b)*a(a|b){20}$", ku_regex_work);
    ASSERT_EQ(c.rc(), 0);
    EXPECT_EQ(c.program().state_count, 0);
    EXPECT_TRUE(c.finds("ba" + std::string(20, 'b')));
    EXPECT_FALSE(c.finds("ab" + std::string(20, 'b')));
}

TEST(regular_expressions, anchors_hold_at_the_ends_of_the_text_only)
{
    for (const uint32_t work : {ku_regex_work, too_little_for_a_table}) {
        EXPECT_TRUE(compiled("^a", work).finds("ab"));
        EXPECT_FALSE(compiled("^a", work).finds("ba"));
        EXPECT_FALSE(compiled("^a", work).finds("b\na"));
        EXPECT_FALSE(compiled("b$", work).finds("b\na"));
        EXPECT_TRUE(compiled("b.a", work).finds("b\na"));
        EXPECT_TRUE(compiled("^$", work).finds(""));
        EXPECT_TRUE(compiled("$^", work).finds(""));
        EXPECT_FALSE(compiled("$^", work).finds("x"));
        EXPECT_FALSE(compiled("a$b", work).finds("ab"));
        EXPECT_TRUE(compiled("x|$", work).finds("ab"));
        EXPECT_TRUE(compiled("(^|x)a", work).finds("a"));
        EXPECT_FALSE(compiled("(^|x)a", work).finds("ya"));
    }
}

TEST(regular_expressions, a_set_may_hold_brackets_hyphens_and_carets)
{
    EXPECT_TRUE(compiled("^[]]$", ku_regex_work).finds("]"));
    EXPECT_TRUE(compiled("^[^]]$", ku_regex_work).finds("a"));
    EXPECT_TRUE(compiled("^[a-]$", ku_regex_work).finds("-"));
    EXPECT_TRUE(compiled("^[-a]$", ku_regex_work).finds("-"));
    EXPECT_TRUE(compiled("^[a^]$", ku_regex_work).finds("^"));
    EXPECT_TRUE(compiled("^[[.-.]]$", ku_regex_work).finds("-"));
    EXPECT_TRUE(compiled("^[[=a=]]$", ku_regex_work).finds("a"));
    EXPECT_TRUE(compiled("^[[]$", ku_regex_work).finds("["));
    EXPECT_TRUE(compiled("^[\\]$", ku_regex_work).finds("\\")); // a backslash has no meaning in a set
    EXPECT_TRUE(compiled("^[a-c-e]$", ku_regex_work).finds("e"));
}

} // namespace
