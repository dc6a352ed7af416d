// SPDX-License-Identifier: MIT
// import: types, headers, errors with their lines, and that a failed import changes nothing.
#include <chrono>
#include <csignal>
#include <thread>

#include "program.h"

using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

const char * const hosts = "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n";

TEST(importing, makes_a_table_with_types_that_fit_the_file)
{
    scratch at;
    at.write("hosts.csv", "name,load,cpus,big,zip,note\nalpha,0.25,4,18446744073709551615,01234,x\n"
                          "beta,2,-16,1,99999,\n");
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create", "--key", "name"}).code, 0);
    EXPECT_EQ(at.run({"schema", "hosts"}).out,
              "name:string:key\nload:float64\ncpus:int64\nbig:uint64\nzip:string\nnote:string\n");
    EXPECT_EQ(at.run({"get", "hosts", "beta", "-o", "csv"}).out,
              "name,load,cpus,big,zip,note\r\nbeta,2.0,-16,1,99999,\"\"\r\n");
}

TEST(importing, types_that_are_named_are_taken_and_their_defaults_fill_missing_cells)
{
    scratch at;
    at.write("hosts.csv", "name,load,cpus\nalpha,,4\nbeta,1.5,\n");
    const result made =
        at.run({"import", "hosts", "hosts.csv", "--create", "-k", "name", "--types", "load:float32=0.5,cpus:uint32=1"});
    ASSERT_EQ(made.code, 0) << made.err;
    EXPECT_EQ(at.run({"schema", "hosts"}).out, "name:string:key\nload:float32=0.5\ncpus:uint32=1\n");
    EXPECT_EQ(at.run({"select", "hosts", "-H", "-o", "tsv"}).out, "alpha\t0.5\t4\nbeta\t1.5\t1\n");
}

TEST(importing, the_key_comes_first_whatever_the_order_of_the_file)
{
    scratch at;
    at.write("hosts.csv", "load,cpus,name\n1.5,2,alpha\n");
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create", "--key", "name"}).code, 0);
    EXPECT_EQ(at.run({"schema", "hosts"}).out, "name:string:key\nload:float64\ncpus:int64\n");
}

TEST(importing, without_a_key_option_the_first_column_is_it_and_that_is_told)
{
    scratch at;
    at.write("hosts.csv", hosts);
    const result made = at.run({"import", "hosts", "hosts.csv", "--create"});
    EXPECT_EQ(made.code, 0);
    EXPECT_NE(made.err.find("the key is the first column, \"name\""), std::string::npos);
}

TEST(importing, adds_to_a_table_by_the_names_of_the_header)
{
    scratch at;
    at.write("hosts.csv", hosts);
    at.write("more.csv", "cpus,name\n2,gamma\n");
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create"}).code, 0);
    const result added = at.run({"import", "hosts", "more.csv"});
    ASSERT_EQ(added.code, 0) << added.err;
    EXPECT_EQ(added.out, "");
    EXPECT_EQ(added.err, "ktrg: hosts: 1 row was imported\n");
    EXPECT_EQ(at.run({"get", "hosts", "gamma", "-o", "jsonl"}).out, "{\"name\":\"gamma\",\"load\":0.0,\"cpus\":2}\n");
}

TEST(importing, reads_standard_input_tabs_byte_order_marks_and_carriage_returns)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "\xef\xbb\xbfname,n\r\nx,1\r\ny,2\r\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-H", "-o", "tsv"}).out, "x\t1\ny\t2\n");
    at.write("b.tsv", "name\tn\nx, y\t1\n");
    ASSERT_EQ(at.run({"import", "b", "b.tsv", "--create"}).code, 0);
    EXPECT_EQ(at.run({"select", "b", "-H", "-o", "csv"}).out, "\"x, y\",1\r\n");
}

TEST(importing, quotes_commas_and_line_ends_inside_a_cell_are_kept)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,note\n\"a,b\",\"say \"\"hi\"\"\nand bye\"\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-o", "csv"}).out, "name,note\r\n\"a,b\",\"say \"\"hi\"\"\nand bye\"\r\n");
}

TEST(importing, spaces_are_part_of_a_cell)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,note\nx,  y \n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "-H", "-o", "csv"}).out, "x,  y \r\n");
}

TEST(importing, a_file_without_a_header_gets_columns_by_number)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create", "-H"}, "x,1\ny,2\n").code, 0);
    EXPECT_EQ(at.run({"schema", "a"}).out, "c1:string:key\nc2:int64\n");
}

TEST(importing, headings_that_no_column_can_have_are_changed_and_told)
{
    scratch      at;
    const result made = at.run({"import", "a", "-", "--create"}, "Package,Installed-Size,2nd\nx,1,2\n");
    ASSERT_EQ(made.code, 0);
    EXPECT_EQ(at.run({"schema", "a"}).out, "Package:string:key\nInstalled_Size:int64\nc2nd:int64\n");
    EXPECT_NE(made.err.find("\"Installed-Size\" becomes \"Installed_Size\""), std::string::npos);
}

TEST(importing, map_gives_a_column_of_the_file_another_name)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create", "--map", "Name=id"}, "Name,n\nx,1\n").code, 0);
    EXPECT_EQ(at.run({"schema", "a"}).out, "id:string:key\nn:int64\n");
}

TEST(importing, arrays_structures_binaries_and_handles_come_as_json_and_go_back_the_same)
{
    scratch           at;
    const std::string text = "id,list,where,raw,who,names\r\n"
                             "1,\"[1,-2,3]\",\"{\"\"street\"\":\"\"Elm\"\",\"\"number\"\":7}\",\"\"\"0x00ff\"\"\","
                             "0x0001 0x0002 0x00000003 0x00000004 0x00000005 0x00000006,\"[\"\"a\"\",\"\"b\"\"]\"\r\n";
    const result      made = at.run({"import", "a", "-", "--create", "--types", "list:int64[]", "--types",
                                     "where:struct(street:string;number:int32)"},
                                    text);
    EXPECT_EQ(made.code, 2); // a struct's fields are separated by commas
    const result right =
        at.run({"import", "a", "-", "--create", "--types",
                "list:int32[],where:struct(street:string,number:int32),raw:binary,who:handle,names:string[]"},
               text);
    ASSERT_EQ(right.code, 0) << right.err;
    EXPECT_EQ(at.run({"select", "a", "-o", "csv"}).out, text);
    EXPECT_EQ(at.run({"select", "a", "-o", "jsonl"}).out,
              "{\"id\":1,\"list\":[1,-2,3],\"where\":{\"street\":\"Elm\",\"number\":7},\"raw\":\"0x00ff\","
              "\"who\":\"0x0001 0x0002 0x00000003 0x00000004 0x00000005 0x00000006\",\"names\":[\"a\",\"b\"]}\n");
}

// ---- Refusals: each leaves things as they were ----

TEST(importing, a_value_that_does_not_fit_names_its_line_and_nothing_stays)
{
    scratch      at;
    const result made =
        at.run({"import", "a", "-", "--create", "--types", "n:int32"}, "name,n\nx,1\n\"y\nz\",2\nw,3000000000\n");
    EXPECT_EQ(made.code, 2);
    EXPECT_EQ(made.err, "ktrg: a: the key is the first column, \"name\"; --key chooses another\n"
                        "ktrg: a: standard input:5: column \"n\": \"3000000000\" is not an int32\n");
    EXPECT_FALSE(at.exists("a"));
    EXPECT_FALSE(at.exists("a.rewrite"));
}

TEST(importing, a_failed_import_leaves_the_file_byte_for_byte_as_it_was)
{
    scratch at;
    at.write("hosts.csv", hosts);
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create"}).code, 0);
    const std::string before = at.read("hosts");
    const result      added  = at.run({"import", "hosts", "-"}, "name,load\ngamma,1\nalpha,2\n");
    EXPECT_EQ(added.code, 6);
    EXPECT_EQ(added.err, "ktrg: hosts: standard input:3: a row with the key \"alpha\" exists [108]\n");
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(importing, an_unknown_column_is_refused_with_a_near_name)
{
    scratch at;
    at.write("state/hosts.csv", hosts);
    ASSERT_EQ(at.run({"import", "state/hosts", "state/hosts.csv", "--create"}).code, 0);
    const result added = at.run({"import", "state/hosts", "-"}, "nam,load\nx,1\n");
    EXPECT_EQ(added.code, 2);
    EXPECT_EQ(added.err, "ktrg: state/hosts: no column \"nam\" (did you mean \"name\"?) [105]\n");
}

TEST(importing, a_missing_key_column_or_cell_is_refused)
{
    scratch at;
    at.write("hosts.csv", hosts);
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create"}).code, 0);
    EXPECT_EQ(at.run({"import", "hosts", "-"}, "load\n1\n").code, 2);
    ASSERT_EQ(at.run({"import", "numbers", "-", "--create"}, "id,n\n1,2\n").code, 0);
    EXPECT_EQ(at.run({"import", "numbers", "-"}, "id,n\n,2\n").code, 2);
}

TEST(importing, rows_of_another_width_name_their_line)
{
    scratch      at;
    const result made = at.run({"import", "a", "-", "--create"}, "name,n\nx,1\n\ny\n");
    EXPECT_EQ(made.code, 2);
    EXPECT_NE(made.err.find("standard input:4: 1 fields, where the header has 2"), std::string::npos) << made.err;
    EXPECT_FALSE(at.exists("a"));
}

TEST(importing, broken_quotes_name_their_line)
{
    scratch at;
    EXPECT_NE(at.run({"import", "a", "-", "--create"}, "name,n\nx\"y,1\n").err.find("standard input:2: not CSV"),
              std::string::npos);
    const result open = at.run({"import", "a", "-", "--create"}, "name,n\nx,1\n\"y,1\n");
    EXPECT_EQ(open.code, 2);
    EXPECT_NE(open.err.find("standard input:3: not CSV"), std::string::npos) << open.err;
}

TEST(importing, an_empty_file_and_one_that_is_not_there_are_refused)
{
    scratch at;
    EXPECT_EQ(at.run({"import", "a", "-", "--create"}, "").code, 2);
    EXPECT_EQ(at.run({"import", "a", "nowhere.csv", "--create"}).code, 3);
    EXPECT_FALSE(at.exists("a"));
}

TEST(importing, a_header_alone_makes_an_empty_table)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "a", "-", "--create"}, "name,n\n").code, 0);
    EXPECT_EQ(at.run({"select", "a", "--count"}).out, "0\n");
}

TEST(importing, create_refuses_a_table_that_exists_and_plain_import_one_that_does_not)
{
    scratch at;
    at.write("hosts.csv", hosts);
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create"}).code, 0);
    const std::string before = at.read("hosts");
    const result      twice  = at.run({"import", "hosts", "hosts.csv", "--create", "-q"});
    EXPECT_EQ(twice.code, 6);
    EXPECT_EQ(twice.err, "ktrg: hosts: the table exists [201]\n");
    EXPECT_EQ(at.read("hosts"), before);
    const result absent = at.run({"import", "hots", "hosts.csv"});
    EXPECT_EQ(absent.code, 3);
    EXPECT_EQ(absent.err, "ktrg: hots: no such table (did you mean \"hosts\"?) [200]\n");
}

TEST(importing, a_dry_run_finds_what_is_wrong_and_writes_nothing)
{
    scratch at;
    at.write("hosts.csv", hosts);
    EXPECT_EQ(at.run({"import", "hosts", "hosts.csv", "--create", "--dry-run"}).code, 0);
    EXPECT_FALSE(at.exists("hosts"));
    ASSERT_EQ(at.run({"import", "hosts", "hosts.csv", "--create"}).code, 0);
    const std::string before = at.read("hosts");
    EXPECT_EQ(at.run({"import", "hosts", "-", "-n"}, "name\ngamma\n").code, 0);
    EXPECT_EQ(at.run({"import", "hosts", "-", "-n"}, "name\nalpha\n").code, 6);
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(importing, types_of_columns_that_the_file_lacks_are_refused)
{
    scratch      at;
    const result made = at.run({"import", "a", "-", "--create", "--types", "nam:string"}, "name,n\nx,1\n");
    EXPECT_EQ(made.code, 2);
    EXPECT_NE(made.err.find("no column \"nam\" (did you mean \"name\"?) [105]"), std::string::npos) << made.err;
    EXPECT_EQ(at.run({"import", "a", "-", "--create", "--types", "n:int63"}, "name,n\nx,1\n").err,
              "ktrg: no type \"int63\" (did you mean \"int64\"?); types are int32 uint32 int64 uint64 float32 float64 "
              "string binary handle sbs struct(...), and [] behind one for an array [105]\n");
}

TEST(importing, a_directory_that_is_not_there_is_not_made)
{
    scratch      at;
    const result made = at.run({"import", "state/a", "-", "--create", "-q"}, "name,n\nx,1\n");
    EXPECT_EQ(made.code, 3);
    EXPECT_EQ(made.err, "ktrg: state/a: no directory \"state\" [200]\n");
    EXPECT_FALSE(at.exists("state"));
}

TEST(importing, an_interrupt_ends_it_with_130_and_nothing_stays)
{
    scratch                at;
    const scratch::running import = at.start({"import", "a", "-", "--create"});
    ASSERT_GT(write(import.input, "name,n\nx,1\n", 11), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(300)); // it waits for more input by then
    kill(import.pid, SIGINT);
    const result ended = at.finish(import);
    EXPECT_EQ(ended.code, 130);
    EXPECT_FALSE(at.exists("a"));
}

TEST(importing, twenty_thousand_rows_come_back_as_they_went_in)
{
    scratch     at;
    std::string text = "id,name,ratio\r\n";
    for (int i = 0; i < 20000; i++)
        text += std::to_string(i) + ",name " + std::to_string(i * 7919 % 20000) + "," + std::to_string(i) + ".5\r\n";
    at.write("big.csv", text);
    ASSERT_EQ(at.run({"import", "big", "big.csv", "--create"}).code, 0);
    EXPECT_EQ(at.run({"select", "big", "--sort", "id", "-o", "csv"}).out, text);
    EXPECT_EQ(at.run({"select", "big", "--count"}).out, "20000\n");
}

} // namespace
