// SPDX-License-Identifier: MIT
// pack and unpack: tables go into a file and come out of it, also from a machine of the other byte order; and files
// from anybody do no harm.
#include <csignal>
#include <fstream>
#include <regex>
#include <set>

#include <nlohmann/json.hpp>
#include <sys/stat.h>

#include "failure.h"
#include "holder.h"
#include "packed_file.h"
#include "program.h"

using ktrg_test::holder;
using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(const scratch & at, const std::string & table = "hosts")
{
    const result made = at.run({"import", table, "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

void make_disks(const scratch & at, const std::string & table = "net,disks")
{
    const result made = at.run({"import", table, "-", "--create", "--types", "tags:string[],raw:binary"},
                               "id,tags,raw\n1,\"[\"\"a\"\",\"\"b\"\"]\",0x00ff\n2,,\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

std::string rows_of(const scratch & at, const std::string & table)
{
    return at.run({"select", table, "-H", "-o", "jsonl"}).out;
}

void expect_result(const result & end, int code, const std::string & err)
{
    EXPECT_EQ(end.code, code);
    EXPECT_EQ(end.out, "");
    EXPECT_EQ(end.err, err);
}

std::string size_of(const scratch & at, const std::string & file)
{
    return std::to_string(at.read(file).size());
}

// Names in the directory, without what the library and the test keep there.
std::set<std::string> names_in(const scratch & at, const std::string & directory)
{
    std::set<std::string> names;
    for (const std::string & name : ktrg::files_in(at.file(directory)))
        if (name != "." && name != ".." && name != ",Lock" && name != ".io" && name != ".keep")
            names.insert(name);
    return names;
}

// ---- pack ----

TEST(packing, several_tables_come_out_of_the_file_as_they_went_in)
{
    scratch at;
    at.write("out/.keep", "");
    make_hosts(at);
    make_disks(at);
    const result packed = at.run({"pack", "both.packed", "hosts", "net,disks"});
    expect_result(packed, 0, "ktrg: both.packed: 2 tables packed (" + size_of(at, "both.packed") + " bytes)\n");
    expect_result(at.run({"unpack", "both.packed", "out"}), 0,
                  "ktrg: out/hosts: unpacked (2 rows)\nktrg: out/net,disks: unpacked (2 rows)\n");
    EXPECT_EQ(names_in(at, "out"), (std::set<std::string>{"hosts", "net,disks"}));
    for (const std::string table : {"hosts", "net,disks"}) {
        EXPECT_EQ(rows_of(at, "out/" + table), rows_of(at, table));
        EXPECT_EQ(at.run({"schema", "out/" + table}).out, at.run({"schema", table}).out);
    }
    ASSERT_EQ(at.run({"put", "out/hosts", "name=gamma"}).code, 0);
    EXPECT_EQ(at.run({"select", "out/hosts", "--count"}).out, "3\n");
}

TEST(packing, goes_through_a_pipe)
{
    scratch at;
    at.write("out/.keep", "");
    make_hosts(at);
    const result packed = at.run({"pack", "-", "hosts"});
    EXPECT_EQ(packed.code, 0);
    EXPECT_EQ(packed.err, "ktrg: standard output: 1 table packed (" + std::to_string(packed.out.size()) + " bytes)\n");
    EXPECT_EQ(at.run({"unpack", "-", "out"}, packed.out).code, 0);
    EXPECT_EQ(rows_of(at, "out/hosts"), rows_of(at, "hosts"));
}

TEST(packing, to_a_terminal_is_refused)
{
    scratch at;
    make_hosts(at);
    const result end = at.run_on_terminal({"pack", "-", "hosts"}, 80);
    EXPECT_EQ(end.code, 2);
    EXPECT_EQ(end.out, "");
}

TEST(packing, over_a_file_that_exists_needs_force)
{
    scratch at;
    make_hosts(at);
    at.write("p", "what was here before");
    expect_result(at.run({"pack", "p", "hosts"}), 6, "ktrg: p: the file exists; --force replaces it\n");
    EXPECT_EQ(at.read("p"), "what was here before");
    EXPECT_EQ(at.run({"pack", "p", "hosts", "-f", "-n"}).code, 0);
    EXPECT_EQ(at.read("p"), "what was here before");
    EXPECT_EQ(at.run({"pack", "p", "hosts", "-f"}).code, 0);
    EXPECT_EQ(at.run({"unpack", "p", "--info"}).code, 0);
    EXPECT_EQ(at.run({"pack", "/dev/null", "hosts", "-f"}).code, 2);
}

TEST(packing, a_dry_run_writes_no_file)
{
    scratch at;
    make_hosts(at);
    const result end = at.run({"pack", "p", "hosts", "-n"});
    EXPECT_TRUE(std::regex_match(end.err, std::regex("ktrg: p: 1 table would be packed \\([0-9]+ bytes\\)\n")))
        << end.err;
    EXPECT_FALSE(at.exists("p"));
}

TEST(packing, what_cannot_be_packed_leaves_no_file)
{
    scratch at;
    make_hosts(at);
    make_hosts(at, "damaged");
    at.write("a/.keep", "");
    make_hosts(at, "a/hosts");
    at.write("damaged", at.read("damaged").substr(0, 200));
    EXPECT_EQ(at.run({"pack", "p", "hosts", "damaged"}).code, 4);
    EXPECT_EQ(at.run({"pack", "p", "hosts", "nothing"}).code, 3);
    EXPECT_EQ(at.run({"pack", "p", "hosts@1"}).code, 6);
    expect_result(at.run({"pack", "p", "hosts", "a/hosts"}), 2,
                  "ktrg: a/hosts: hosts has the same name: they couldn't be unpacked together\n");
    EXPECT_EQ(at.run({"pack", "nowhere/p", "hosts"}).code, 3);
    EXPECT_EQ(at.run({"pack", "p", "hosts", "--prefix", "not a path"}).code, 2);
    ASSERT_EQ(chmod(at.file("hosts").c_str(), 0), 0);
    EXPECT_EQ(at.run({"pack", "p", "hosts"}).code, 8);
    EXPECT_EQ(names_in(at, "."), (std::set<std::string>{"a", "damaged", "hosts"}));
}

TEST(packing, without_room_on_the_disk_is_7_and_leaves_no_file)
{
    scratch     at;
    std::string text = "id,n\n";
    for (int i = 0; i < 200; i++)
        text += std::to_string(i) + ",1\n";
    ASSERT_EQ(at.run({"import", "big", "-", "--create"}, text).code, 0);
    const std::string limited = std::string("trap '' XFSZ; ulimit -f 2; exec ") + KTRG_PROGRAM + " ";
    expect_result(at.run_program("/bin/sh", {"-c", limited + "pack p big"}), 7, "ktrg: p: File too large\n");
    EXPECT_EQ(names_in(at, "."), (std::set<std::string>{"big"}));
}

TEST(packing, says_what_does_not_travel)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "at:struct(street:string,number:int32)={\"number\":7}"}).code, 0);
    const result packed = at.run({"pack", "p", "t"});
    EXPECT_EQ(packed.code, 0);
    EXPECT_EQ(packed.err.substr(0, packed.err.rfind("ktrg: p:")),
              "ktrg: t: column \"at\": the first field of its structure, \"street\", arrives as \"et\"\n"
              "ktrg: t: column \"at\": its default doesn't travel\n");
    at.write("out/.keep", "");
    expect_result(at.run({"unpack", "p", "out"}), 0,
                  "ktrg: out/t: column \"at\": the first field of its structure came without its first letters, as "
                  "\"et\"\nktrg: out/t: unpacked (0 rows)\n");
    ASSERT_EQ(at.run({"create", "u", "id:int32:key", "at:struct(x:int32,y:int32)"}).code, 0);
    expect_result(
        at.run({"pack", "q", "u"}), 2,
        "ktrg: u: column \"at\" can't be packed: the name of its first field, \"x\", is shorter than 4 letters; "
        "select -o jsonl carries it\n");
    EXPECT_FALSE(at.exists("q"));
}

// ---- unpack --info ----

TEST(packed_info, tells_byte_order_tables_columns_rows_and_bytes)
{
    scratch at;
    make_hosts(at);
    make_disks(at);
    ASSERT_EQ(at.run({"pack", "p", "hosts", "net,disks", "--prefix", "/state", "-q"}).code, 0);
    const result info = at.run({"unpack", "p", "--info", "-o", "json"});
    EXPECT_EQ(info.code, 0);
    EXPECT_EQ(info.err, "");
    const auto tables = nlohmann::json::parse(info.out);
    ASSERT_EQ(tables.size(), 2U);
    EXPECT_EQ(tables[0]["table"], "hosts");
    EXPECT_EQ(tables[0]["path"], "/state/hosts");
    EXPECT_EQ(tables[0]["sender"], "./hosts");
    EXPECT_EQ(tables[0]["rows"], 2);
    EXPECT_EQ(tables[0]["columns"], 3);
    EXPECT_EQ(tables[0]["counter"], 2);
    EXPECT_EQ(tables[0]["byte_order"], "little-endian");
    EXPECT_EQ(tables[0]["schema"], "name:string:key load:float64 cpus:int64");
    EXPECT_EQ(tables[1]["table"], "net,disks");
    EXPECT_EQ(tables[1]["path"], "/state/net/disks");
    // The header and the directory of two tables take the rest.
    EXPECT_EQ(tables[0]["bytes"].get<std::size_t>() + tables[1]["bytes"].get<std::size_t>() + 40 + 2 * 32,
              at.read("p").size());
}

TEST(packed_info, as_text_is_for_people)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(at.run({"pack", "p", "hosts", "-q"}).code, 0);
    const std::size_t bytes = at.read("p").size();
    EXPECT_EQ(at.run({"unpack", "p", "--info"}).out, "file        p\n"
                                                     "byte order  little-endian\n"
                                                     "bytes       " +
                                                         std::to_string(bytes) +
                                                         "\n"
                                                         "tables      1\n"
                                                         "\n"
                                                         "table       hosts\n"
                                                         "  path      /t/hosts\n"
                                                         "  sender    ./hosts\n"
                                                         "  rows      2\n"
                                                         "  counter   2\n"
                                                         "  bytes     " +
                                                         std::to_string(bytes - 72) +
                                                         "\n"
                                                         "  columns   name:string:key\n"
                                                         "            load:float64\n"
                                                         "            cpus:int64\n");
}

// ---- unpack ----

TEST(unpacking, both_byte_orders_give_the_same_rows)
{
    scratch at;
    at.write("little/.keep", "");
    at.write("big/.keep", "");
    for (const std::string order : {"little", "big"}) {
        const std::string file = std::string(GOLDEN_DIRECTORY) + "/" + order + "_endian.packed";
        EXPECT_EQ(at.run({"unpack", file, order, "-q"}).code, 0);
        EXPECT_NE(at.run({"unpack", file, "--info"}).out.find("byte order  " + order + "-endian\n"), std::string::npos);
    }
    const std::string rows = rows_of(at, "little/everything");
    EXPECT_EQ(std::count(rows.begin(), rows.end(), '\n'), 2);
    EXPECT_EQ(rows_of(at, "big/everything"), rows);
}

TEST(unpacking, over_tables_that_exist_needs_force_and_replaces_all_or_none)
{
    scratch at;
    at.write("out/.keep", "");
    make_hosts(at);
    make_disks(at);
    make_disks(at, "out/net,disks");
    ASSERT_EQ(at.run({"put", "out/net,disks", "id=3"}).code, 0);
    ASSERT_EQ(at.run({"pack", "p", "hosts", "net,disks"}).code, 0);
    expect_result(at.run({"unpack", "p", "out"}), 6,
                  "ktrg: out/net,disks: the table exists; --force replaces it [201]\n");
    EXPECT_EQ(names_in(at, "out"), (std::set<std::string>{"net,disks"}));
    {
        const holder other(at.file("out/net,disks"));
        EXPECT_EQ(at.run({"unpack", "p", "out", "-f"}).code, 5);
        EXPECT_EQ(names_in(at, "out"), (std::set<std::string>{"net,disks"}));
    }
    expect_result(at.run({"unpack", "p", "out", "-f", "-n"}), 0,
                  "ktrg: out/hosts: would be unpacked (2 rows)\n"
                  "ktrg: out/net,disks: would be unpacked over the table that was there (2 rows)\n");
    EXPECT_EQ(names_in(at, "out"), (std::set<std::string>{"net,disks"}));
    EXPECT_EQ(at.run({"unpack", "p", "out", "-f"}).code, 0);
    EXPECT_EQ(rows_of(at, "out/net,disks"), rows_of(at, "net,disks"));
}

TEST(unpacking, wants_a_directory_that_is_there_or_info)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(at.run({"pack", "p", "hosts"}).code, 0);
    expect_result(at.run({"unpack", "p"}), 2, "ktrg: p: unpack wants a directory for the tables, or --info\n");
    EXPECT_EQ(at.run({"unpack", "p", ".", "--info"}).code, 2);
    expect_result(at.run({"unpack", "p", "nowhere"}), 3, "ktrg: nowhere: no such directory\n");
    EXPECT_FALSE(at.exists("nowhere"));
    expect_result(at.run({"unpack", "nothing", "."}), 3, "ktrg: nothing: No such file or directory\n");
    at.write("locked/.keep", "");
    ASSERT_EQ(chmod(at.file("locked").c_str(), 0555), 0);
    EXPECT_EQ(at.run({"unpack", "p", "locked"}).code, 8);
    ASSERT_EQ(chmod(at.file("locked").c_str(), 0755), 0);
}

TEST(unpacking, a_file_that_is_cut_or_longer_or_none_is_damaged_and_makes_nothing)
{
    scratch at;
    at.write("out/.keep", "");
    make_hosts(at);
    ASSERT_EQ(at.run({"pack", "p", "hosts"}).code, 0);
    const std::string whole = at.read("p");
    at.write("cut", whole.substr(0, whole.size() - 1));
    expect_result(at.run({"unpack", "cut", "out"}), 4,
                  "ktrg: cut: the packed file is damaged: it has " + std::to_string(whole.size() - 1) +
                      " bytes, and its header says " + std::to_string(whole.size()) + " [11]\n");
    at.write("longer", whole + "x");
    EXPECT_EQ(at.run({"unpack", "longer", "out"}).code, 4);
    for (const std::string & none : {std::string(), std::string("short"), std::string(200, '\0'), at.read("hosts")}) {
        at.write("none", none);
        expect_result(at.run({"unpack", "none", "out"}), 4, "ktrg: none: not a file of packed tables [11]\n");
    }
    EXPECT_EQ(names_in(at, "out"), std::set<std::string>());
}

TEST(unpacking, without_room_on_the_disk_is_7_and_leaves_nothing)
{
    scratch     at;
    std::string text = "id,n\n";
    for (int i = 0; i < 200; i++)
        text += std::to_string(i) + ",1\n";
    at.write("out/.keep", "");
    make_hosts(at);
    ASSERT_EQ(at.run({"import", "big", "-", "--create"}, text).code, 0);
    ASSERT_EQ(at.run({"pack", "p", "hosts", "big"}).code, 0);
    const std::string limited = std::string("trap '' XFSZ; ulimit -f 2; exec ") + KTRG_PROGRAM + " ";
    EXPECT_EQ(at.run_program("/bin/sh", {"-c", limited + "unpack p out"}).code, 7);
    EXPECT_EQ(names_in(at, "out"), std::set<std::string>());
}

// Each byte of a packed file is changed in turn. Whatever it was, the file is read or refused, in this process under its
// sanitizers.
TEST(unpacking, a_file_with_any_byte_changed_is_read_or_refused)
{
    scratch at;
    make_disks(at, "t");
    ASSERT_EQ(at.run({"pack", "p", "t"}).code, 0);
    const std::string whole   = at.read("p");
    std::size_t       refused = 0;
    for (std::size_t i = 0; i < whole.size(); i++) {
        for (const char mask : {'\x01', '\x80', '\xff'}) {
            std::string changed = whole;
            changed[i]          = static_cast<char>(changed[i] ^ mask);
            at.write("changed", changed);
            try {
                ktrg::packed_file file = ktrg::packed_file::read(at.file("changed"));
                for (std::size_t table = 0; table < file.tables().size(); table++)
                    (void)file.unpack(table, ktrg::place{});
            } catch (const ktrg::failure & what) {
                EXPECT_EQ(what.exit(), ktrg::exit_code::damaged) << i << ": " << what.text();
                refused++;
            }
        }
    }
    EXPECT_GT(refused, whole.size());
}

// ---- What a killed unpack leaves ----

TEST(repairing, removes_the_directory_that_a_killed_unpack_was_working_in)
{
    scratch at;
    at.write("state/.ktrg-abc123/held", "");
    at.write("state/.ktrg-abc123/hosts", "half a table");
    at.write("state/.ktrg-mine", "");
    expect_result(at.run({"repair", "state", "-n"}), 0,
                  "ktrg: state/.ktrg-abc123: a leftover directory would be removed\n");
    {
        const holder other(at.file("state/.ktrg-abc123/held"));
        EXPECT_EQ(at.run({"repair", "state"}).code, 5);
        EXPECT_TRUE(at.exists("state/.ktrg-abc123/hosts"));
    }
    expect_result(at.run({"repair", "state"}), 0, "ktrg: state/.ktrg-abc123: a leftover directory was removed\n");
    EXPECT_EQ(names_in(at, "state"), (std::set<std::string>{".ktrg-mine"}));
}

} // namespace
