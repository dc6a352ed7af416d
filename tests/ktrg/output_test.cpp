// SPDX-License-Identifier: MIT
// output: what every form makes of the values that are hard.
#include <nlohmann/json.hpp>

#include "program.h"

using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

// A table with a value of each kind that matters.
void make_edges(scratch & at)
{
    const result made =
        at.run({"import", "edges", "-", "--create", "--types", "small:int64,large:uint64,real:float64,single:float32"},
               "name,small,large,real,single\n"
               "edge,-9223372036854775808,18446744073709551615,0.1,0.1\n"
               "odd,1,2,nan,-inf\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

TEST(json_output, integers_of_64_bits_are_numbers_to_the_last_digit)
{
    scratch at;
    make_edges(at);
    EXPECT_EQ(at.run({"get", "edges", "edge", "-o", "json"}).out,
              "[\n {\"name\":\"edge\",\"small\":-9223372036854775808,\"large\":18446744073709551615,\"real\":0.1,"
              "\"single\":0.1}\n]\n");
}

TEST(json_output, integers_of_64_bits_are_strings_for_those_who_need_it)
{
    scratch at;
    make_edges(at);
    EXPECT_EQ(at.run({"get", "edges", "edge", "-o", "jsonl", "--json-int64=string", "-c", "small,large"}).out,
              "{\"small\":\"-9223372036854775808\",\"large\":\"18446744073709551615\"}\n");
}

TEST(json_output, nan_and_the_infinities_are_null)
{
    scratch at;
    make_edges(at);
    EXPECT_EQ(at.run({"get", "edges", "odd", "-o", "jsonl", "-c", "real,single"}).out,
              "{\"real\":null,\"single\":null}\n");
    EXPECT_EQ(at.run({"get", "edges", "odd", "-o", "csv", "-H", "-c", "real,single"}).out, "nan,-inf\r\n");
}

TEST(json_output, an_empty_result_is_an_empty_array_and_nothing_in_jsonl)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,n\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "json"}).out, "[]\n");
    EXPECT_EQ(at.run({"select", "a", "-o", "jsonl"}).out, "");
    EXPECT_EQ(at.run({"ls", ".io", "-o", "json"}).out, "[]\n");
}

TEST(json_output, every_string_is_json_that_a_parser_takes)
{
    scratch           at;
    const std::string text = "quote \"\" back \\ tab \t bell \a del \x7f snow \xe2\x98\x83";
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,t\nx,\"" + text + "\"\n").code, 0);
    const auto parsed = nlohmann::json::parse(at.run({"select", "a", "-o", "json"}).out);
    EXPECT_EQ(parsed[0]["t"], "quote \" back \\ tab \t bell \a del \x7f snow \xe2\x98\x83");
}

TEST(output, bytes_that_are_not_utf_8_are_shown_escaped_and_the_output_goes_on)
{
    scratch      at;
    const result made = at.run({"import", "a", "-", "--create", "-k", "n"}, "name,n\nM\xfcller,1\nMeier,2\n");
    ASSERT_EQ(made.code, 0);
    EXPECT_NE(made.err.find("1 cell is not UTF-8; the bytes are kept"), std::string::npos);
    EXPECT_EQ(at.run({"select", "a", "-o", "jsonl"}).out,
              "{\"n\":1,\"name\":\"M\\\\xfcller\"}\n{\"n\":2,\"name\":\"Meier\"}\n");
    EXPECT_EQ(at.run({"select", "a", "-o", "csv", "-H"}).out, "1,M\\xfcller\r\n2,Meier\r\n");
    EXPECT_EQ(at.run({"select", "a", "-q", "-H"}).out, "1  M\\xfcller\n2  Meier\n");
}

TEST(output, control_characters_never_reach_a_reader_of_text)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,t\nx,\"a\nb\x1b[31m\t\xc2\x9b\"\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-H", "-q"}).out, "x  a\\nb\\x1b[31m\\t\\xc2\\x9b\n");
    EXPECT_EQ(at.run({"select", "a", "-o", "line", "-q"}).out, "name = x\n   t = a\\nb\\x1b[31m\\t\\xc2\\x9b\n");
}

TEST(csv_output, is_as_rfc_4180_has_it)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,t\nx,\"a,b\"\ny,\"say \"\"hi\"\"\"\nz,\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "csv"}).out, "name,t\r\nx,\"a,b\"\r\ny,\"say \"\"hi\"\"\"\r\nz,\"\"\r\n");
}

TEST(tsv_output, has_one_line_a_row_whatever_the_cells_hold)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,t\nx,\"a\tb\nc\\d\"\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "tsv"}).out, "name\tt\nx\ta\\tb\\nc\\\\d\n");
}

TEST(markdown_output, is_a_table_with_bars_escaped)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,n\na|b,1\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "markdown"}).out, "| name | n |\n| --- | ---: |\n| a\\|b | 1 |\n");
}

TEST(table_output, aligns_by_the_width_on_the_screen)
{
    scratch at;
    ASSERT_EQ(
        at.run({"import", "a", "-", "--create"}, "name,n\n\xe6\x97\xa5\xe6\x9c\xac,1\ne\xcc\x81,22\nplain,333\n").code,
        0);
    EXPECT_EQ(at.run({"select", "a", "-q"}).out, "name     n\n"
                                                 "\u2500\u2500\u2500\u2500\u2500  \u2500\u2500\u2500\n"
                                                 "\xe6\x97\xa5\xe6\x9c\xac     1\n"
                                                 "e\xcc\x81       22\n"
                                                 "plain  333\n");
}

TEST(table_output, long_cells_are_cut_on_a_terminal_only)
{
    scratch           at;
    const std::string text(100, 'y');
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,t\nx," + text + "\n").code, 0);
    EXPECT_NE(at.run({"select", "a"}).out.find(text), std::string::npos);
    const result on_terminal = at.run_on_terminal({"select", "a", "-H", "--color", "never"}, 40);
    EXPECT_EQ(on_terminal.out, "x  " + std::string(36, 'y') + "\u2026\r\n");
    EXPECT_NE(at.run_on_terminal({"select", "a", "-o", "jsonl"}, 40).out.find(text), std::string::npos);
}

TEST(table_output, colours_appear_on_a_terminal_unless_no_color_is_set)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,n\nx,1\n").code, 0);
    EXPECT_NE(at.run_on_terminal({"select", "a"}, 80).out.find("\x1b["), std::string::npos);
    EXPECT_EQ(at.run({"select", "a"}).out.find("\x1b["), std::string::npos);
    EXPECT_NE(at.run({"select", "a", "--color", "always"}).out.find("\x1b["), std::string::npos);
    at.environment = {"NO_COLOR=1"};
    EXPECT_EQ(at.run_on_terminal({"select", "a"}, 80).out.find("\x1b["), std::string::npos);
    at.environment = {"NO_COLOR="};
    EXPECT_NE(at.run_on_terminal({"select", "a"}, 80).out.find("\x1b["), std::string::npos);
}

TEST(output, header_and_null_options_are_obeyed)
{
    scratch at;
    at.write("t/whole.csv", "name,n\nx,1\n");
    ASSERT_EQ(at.run({"import", "t/a", "t/whole.csv", "--create"}).code, 0);
    EXPECT_EQ(at.run({"schema", "t/a", "-o", "csv", "-H", "--null", "NONE"}).out,
              "name,string,key,NONE\r\nn,int64,NONE,NONE\r\n");
}

TEST(output, binaries_have_the_form_that_was_asked_for)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create", "--types", "raw:binary"}, "name,raw\nx,0x68690a\ny,\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "jsonl", "-c", "raw"}).out, "{\"raw\":\"0x68690a\"}\n{\"raw\":\"0x\"}\n");
    EXPECT_EQ(at.run({"get", "a", "x", "-o", "jsonl", "-c", "raw", "--bytes", "base64"}).out, "{\"raw\":\"aGkK\"}\n");
    EXPECT_EQ(at.run({"get", "a", "x", "-o", "jsonl", "-c", "raw", "--bytes", "text"}).out, "{\"raw\":\"hi\\n\"}\n");
}

TEST(output, a_reader_that_goes_away_ends_it_quietly)
{
    scratch     at;
    std::string text = "name,n\n";
    for (int i = 0; i < 20000; i++)
        text += "row" + std::to_string(i) + ",1\n";
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, text).code, 0);
    const result end = at.run_program("/bin/sh", {"-c", std::string(KTRG_PROGRAM) + " select a -o csv | head -n 1"});
    EXPECT_EQ(end.out, "name,n\r\n");
    EXPECT_EQ(end.err, "");
}

TEST(output, a_full_disk_is_told_and_ends_with_7)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,n\nx,1\n").code, 0);
    const result end = at.run_program("/bin/sh", {"-c", std::string(KTRG_PROGRAM) + " select a -q >/dev/full"});
    EXPECT_EQ(end.code, 7);
    EXPECT_EQ(end.err, "ktrg: standard output: No space left on device\n");
}

} // namespace
