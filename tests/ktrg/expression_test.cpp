// SPDX-License-Identifier: MIT
// expressions: select and rm by them, and how a wrong one is shown.
#include "failure.h"
#include "kt_rg.h"
#include "program.h"
#include "selection.h"

using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(const scratch & at)
{
    const result made = at.run({"import", "hosts", "-", "--create"},
                               "name,load,cpus,note\nalpha,0.25,4,a$b\nbeta,1.5,16,100%\nab,-3,8,\"say \"\"x\"\"\"\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

std::string names_of(const scratch & at, const std::string & expression)
{
    const result rows = at.run({"select", "hosts", expression, "-c", "name", "-s", "name", "-H", "-o", "tsv"});
    EXPECT_EQ(rows.code, 0) << rows.err;
    return rows.out;
}

TEST(selecting_by_expression, shows_the_rows_that_match)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(names_of(at, "cpus > 4"), "ab\nbeta\n");
    EXPECT_EQ(names_of(at, "name like 'a%' && load < 0"), "ab\n");
    EXPECT_EQ(names_of(at, "load * 2 == 3"), "beta\n");
    EXPECT_EQ(names_of(at, "cpus in (4, 8)"), "ab\nalpha\n");
    EXPECT_EQ(names_of(at, "cpus > 1000"), "");
    EXPECT_EQ(names_of(at, "(-cpus) < -8"), "beta\n");
}

TEST(selecting_by_expression, an_expression_may_begin_with_a_minus)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(names_of(at, "-4 + cpus == 0"), "alpha\n");
}

TEST(selecting_by_expression, dollars_and_quotes_in_strings_mean_themselves)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(names_of(at, "note == 'a$b'"), "alpha\n");
    EXPECT_EQ(names_of(at, "note == \"a$b\""), "alpha\n");
    EXPECT_EQ(names_of(at, "note == $\"a\\x24b\""), "alpha\n");
    EXPECT_EQ(names_of(at, "note =~ 'b$'"), "alpha\n");
    EXPECT_EQ(names_of(at, "note =~ $'b$'"), "alpha\n");
    EXPECT_EQ(names_of(at, "note == 'say \"x\"'"), "ab\n");
    EXPECT_EQ(names_of(at, "note != '$\"'"), "ab\nalpha\nbeta\n");
}

TEST(selecting_by_expression, count_and_limit_go_with_it)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"select", "hosts", "cpus >= 8", "--count"}).out, "2\n");
    EXPECT_EQ(at.run({"select", "hosts", "cpus >= 8", "--sort", "-cpus", "--limit", "1", "-c", "name", "-H"}).out,
              "beta\n");
    EXPECT_EQ(at.run({"select", "hosts", "cpus > 99", "-o", "json"}).out, "[]\n");
}

TEST(a_wrong_expression, is_shown_with_a_caret_under_the_place)
{
    scratch at;
    make_hosts(at);
    const result rows = at.run({"select", "hosts", "cpus > 4 && nam == \"x\""});
    EXPECT_EQ(rows.code, 2);
    EXPECT_EQ(rows.out, "");
    EXPECT_EQ(rows.err, "ktrg: hosts: no column named \"nam\" (did you mean \"name\"?) [105]\n"
                        "  cpus > 4 && nam == \"x\"\n"
                        "              ^\n");
}

TEST(a_wrong_expression, has_its_caret_under_wide_characters_and_in_the_right_line)
{
    scratch at;
    make_hosts(at);
    const result wide = at.run({"select", "hosts", "note == '\xe6\x97\xa5\xe6\x9c\xac' && oops"});
    EXPECT_NE(wide.err.find("\n  note == '\xe6\x97\xa5\xe6\x9c\xac' && oops\n                    ^\n"),
              std::string::npos)
        << wide.err;
    const result lines = at.run({"select", "hosts", "cpus > 4 &&\n  oops > 1"});
    EXPECT_NE(lines.err.find("\n    oops > 1\n    ^\n"), std::string::npos) << lines.err;
}

TEST(a_wrong_expression, of_any_kind_ends_with_2_and_changes_nothing)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    for (const std::string & expression :
         {std::string("("), std::string(""), std::string("cpus >"), std::string("cpus == 'x'"), std::string("name"),
          std::string("$x"), std::string("cpus > $i"), std::string("note == 'open"), std::string("\xff\xfe"),
          std::string("note =~ '('"), std::string(2000, '(')}) {
        EXPECT_EQ(at.run({"select", "hosts", expression}).code, 2) << expression;
        EXPECT_EQ(at.run({"rm", "hosts", "--where", expression}).code, 2) << expression;
    }
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(removing_by_expression, deletes_what_matches_in_one_transaction)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"rm", "hosts", "--where", "cpus >= 8", "-n"}).err, "ktrg: hosts: 2 rows would be deleted\n");
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
    EXPECT_EQ(at.run({"rm", "hosts", "--where", "cpus >= 8"}).err, "ktrg: hosts: 2 rows were deleted\n");
    EXPECT_EQ(names_of(at, "1"), "alpha\n");
    EXPECT_EQ(at.run({"rm", "hosts", "--where", "cpus >= 8"}).code, 1);
    EXPECT_EQ(at.run({"rm", "hosts", "alpha", "--where", "cpus >= 8"}).code, 2);
}

TEST(a_demanded_counter, holds_for_writing_too)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"put", "hosts@2", "name=alpha", "cpus=5"}).code, 0);
    const result moved = at.run({"put", "hosts@2", "name=alpha", "cpus=6"});
    EXPECT_EQ(moved.code, 6);
    EXPECT_EQ(moved.err, "ktrg: hosts: the change counter is 3, not 2: the table has changed\n");
    EXPECT_EQ(names_of(at, "cpus == 5"), "alpha\n");
}

TEST(criteria, write_the_dollars_of_strings_as_escapes_and_leave_the_rest)
{
    EXPECT_EQ(ktrg::criteria_for("a > 1"), "a > 1");
    EXPECT_EQ(ktrg::criteria_for("a == 'x' || b == \"y\""), "a == 'x' || b == \"y\"");
    EXPECT_EQ(ktrg::criteria_for("a == 'x$'"), "a == $\"x\\x24\"");
    EXPECT_EQ(ktrg::criteria_for("a == '\"$\\'"), "a == $\"\\\"\\x24\\\\\"");
    EXPECT_EQ(ktrg::criteria_for("a == $\"t\\tx$\""), "a == $\"t\\tx\\x24\"");
    EXPECT_EQ(ktrg::criteria_for("a == $\"t\\\"x\" && b"), "a == $\"t\\\"x\" && b");
}

TEST(schema, defaults_of_every_type_are_shown_as_create_takes_them)
{
    scratch                        at;
    const std::vector<std::string> columns = {"id:uint32:key", "tags:string[]=[\"a\",\"b\"]",
                                              "at:struct(x:int32,y:int32)={\"x\":1,\"y\":2}", "raw:binary=\"0x00ff\""};
    std::vector<std::string>       words   = {"create", "t"};
    words.insert(words.end(), columns.begin(), columns.end());
    ASSERT_EQ(at.run(words).code, 0);
    std::string expected;
    for (const std::string & column : columns)
        expected += column + "\n";
    EXPECT_EQ(at.run({"schema", "t"}).out, expected);
}

} // namespace
