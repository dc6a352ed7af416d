// SPDX-License-Identifier: MIT
// import: JSON, conflicts, batches and rejected rows; and export, whose output import takes back.
#include <chrono>
#include <csignal>
#include <regex>
#include <thread>

#include <sys/stat.h>
#include <unistd.h>

#include "program.h"

using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(const scratch & at)
{
    const result made = at.run({"import", "hosts", "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

std::string rows_of(const scratch & at, const std::string & table = "hosts")
{
    return at.run({"select", table, "-H", "-o", "tsv"}).out;
}

const char * const hosts_rows = "alpha\t0.25\t4\nbeta\t1.5\t16\n";

void expect_result(const result & end, int code, const std::string & err)
{
    EXPECT_EQ(end.code, code);
    EXPECT_EQ(end.out, "");
    EXPECT_EQ(end.err, err);
}

// ---- JSON ----

TEST(importing_json, makes_a_table_with_types_that_fit_the_values)
{
    scratch at;
    at.write("hosts.json", "[\n {\"name\":\"alpha\",\"load\":0.25,\"big\":18446744073709551615,\"zip\":\"123\","
                           "\"tags\":[\"a\",\"b\"],\"n\":[1,-2],\"up\":true},\n"
                           " {\"name\":\"beta\",\"load\":2,\"n\":[],\"zip\":null,\"tags\":[]}\n]\n");
    expect_result(at.run({"import", "hosts", "hosts.json", "--create", "--key", "name"}), 0,
                  "ktrg: hosts: 2 rows were imported into a new table\n");
    EXPECT_EQ(at.run({"schema", "hosts"}).out, "name:string:key\nload:float64\nbig:uint64\nzip:string\ntags:string[]\n"
                                               "n:int64[]\nup:string\n");
    EXPECT_EQ(at.run({"select", "hosts", "-o", "jsonl"}).out,
              "{\"name\":\"alpha\",\"load\":0.25,\"big\":18446744073709551615,\"zip\":\"123\",\"tags\":[\"a\",\"b\"],"
              "\"n\":[1,-2],\"up\":\"true\"}\n"
              "{\"name\":\"beta\",\"load\":2.0,\"big\":0,\"zip\":\"\",\"tags\":[],\"n\":[],\"up\":\"\"}\n");
}

TEST(importing_json, takes_a_line_an_object_and_members_in_any_order)
{
    scratch at;
    make_hosts(at);
    at.write("more.jsonl", "{\"cpus\":2,\"name\":\"gamma\"}\n\n{\"name\":\"delta\",\"load\":1e-3}\r\n");
    expect_result(at.run({"import", "hosts", "more.jsonl"}), 0, "ktrg: hosts: 2 rows were imported\n");
    EXPECT_EQ(rows_of(at), std::string(hosts_rows) + "gamma\t0.0\t2\ndelta\t0.001\t0\n");
    EXPECT_EQ(at.run({"import", "hosts", "-", "--format", "json"}, "{\"name\":\"one object\"}").code, 0);
    EXPECT_EQ(at.run({"import", "hosts", "-", "--format", "json"}, " [] ").code, 0);
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "5\n");
}

TEST(importing_json, objects_need_their_types_and_come_back_the_same)
{
    scratch           at;
    const std::string row = "{\"id\":1,\"at\":{\"street\":\"Elm \\\"x\\\" [\",\"number\":7},\"in\":[[1],[]]}\n";
    EXPECT_EQ(at.run({"import", "t", "-", "--create", "--format", "jsonl"}, row).err,
              "ktrg: t: column \"at\" holds objects, or arrays of several types; --types says what they are, as in "
              "at:struct(street:string,number:int32)\n");
    EXPECT_FALSE(at.exists("t"));
    ASSERT_EQ(at.run({"import", "t", "-", "--create", "-q", "--format", "jsonl", "--map", "in=", "--types",
                      "at:struct(street:string,number:int32)"},
                     row)
                  .code,
              0);
    EXPECT_EQ(at.run({"select", "t", "-o", "jsonl"}).out,
              "{\"id\":1,\"at\":{\"street\":\"Elm \\\"x\\\" [\",\"number\":7}}\n");
}

TEST(importing_json, what_is_no_json_or_no_row_names_its_line)
{
    scratch    at;
    const auto refusal = [&at](const std::string & format, const std::string & text) {
        const result end = at.run({"import", "t", "-", "--create", "--format", format}, text);
        EXPECT_EQ(end.code, 2) << text;
        EXPECT_FALSE(at.exists("t"));
        return end.err.substr(0, end.err.find(" - "));
    };
    EXPECT_EQ(refusal("json", "[\n{\"a\":1},\n{\"a\":x}\n]"),
              "ktrg: t: standard input:3: not JSON: syntax error while parsing value");
    EXPECT_EQ(refusal("jsonl", "{\"a\":1}\n{\"a\":\n"),
              "ktrg: t: standard input:2: not JSON: syntax error while parsing value");
    EXPECT_EQ(refusal("json", "[1]"), "ktrg: t: standard input:1: a row is an object\n");
    EXPECT_EQ(refusal("json", "[[]]"), "ktrg: t: standard input:1: a row is an object, not an array\n");
    EXPECT_EQ(refusal("json", "\"text\""), "ktrg: t: standard input:1: no object, and no array of objects\n");
    EXPECT_EQ(refusal("json", "[]"), "ktrg: t: standard input: it has no columns\n");
    EXPECT_EQ(refusal("json", "[{\"a\":1}] x").substr(0, 44), "ktrg: t: standard input:1: not JSON: syntax ");
}

TEST(importing_json, a_value_that_does_not_fit_names_its_line)
{
    scratch at;
    make_hosts(at);
    expect_result(
        at.run({"import", "hosts", "-", "--format", "json"}, "[{\"name\":\"x\"},\n{\"name\":\"y\",\n\"cpus\":1.5}]"), 2,
        "ktrg: hosts: standard input:2: column \"cpus\": \"1.5\" is not an int64\n");
    EXPECT_EQ(rows_of(at), hosts_rows);
}

TEST(importing_json, an_object_without_the_key_is_refused)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"import", "hosts", "-", "--format", "jsonl"}, "{\"name\":\"x\"}\n{\"cpus\":1}\n"), 2,
                  "ktrg: hosts: standard input:2: the key \"name\" is missing [107]\n");
    EXPECT_EQ(at.run({"import", "hosts", "-", "--format", "jsonl"}, "{\"name\":null}\n").code, 2);
    EXPECT_EQ(rows_of(at), hosts_rows);
}

TEST(importing_json, a_number_that_nothing_holds_is_refused)
{
    scratch at;
    EXPECT_EQ(at.run({"import", "t", "-", "--create", "--format", "json"}, "{\"a\":1e999}").err,
              "ktrg: t: standard input:1: not JSON: number overflow parsing '1e999'\n");
}

TEST(importing_json, nesting_without_an_end_is_refused)
{
    scratch     at;
    std::string text = "{\"id\":1,\"x\":";
    for (int i = 0; i < 100000; i++)
        text += '[';
    for (int i = 0; i < 100000; i++)
        text += ']';
    EXPECT_EQ(
        at.run({"import", "t", "-", "--create", "-q", "--format", "jsonl", "--types", "x:int32[]"}, text + "}").code,
        2);
}

// ---- Conflicts ----

TEST(conflicts, update_sets_what_the_file_has_and_keeps_the_rest)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"import", "hosts", "-", "--on-conflict", "update"}, "name,cpus\nbeta,99\ngamma,1\nalpha,\n"),
                  0, "ktrg: hosts: 1 row was imported, 2 updated\n");
    EXPECT_EQ(rows_of(at), "alpha\t0.25\t4\nbeta\t1.5\t99\ngamma\t0.0\t1\n");
}

TEST(conflicts, skip_leaves_the_rows_that_are_there)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"import", "hosts", "-", "--on-conflict", "skip"}, "name,cpus\nbeta,99\ngamma,1\n"), 0,
                  "ktrg: hosts: 1 row was imported, 1 skipped\n");
    EXPECT_EQ(rows_of(at), std::string(hosts_rows) + "gamma\t0.0\t1\n");
    const std::string before = at.read("hosts");
    expect_result(at.run({"import", "hosts", "-", "--on-conflict", "skip"}, "name,cpus\nbeta,99\n"), 0,
                  "ktrg: hosts: 0 rows were imported, 1 skipped\n");
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(conflicts, between_two_rows_of_the_file_are_met_alike)
{
    scratch           at;
    const std::string text = "id,n\n1,10\n2,20\n1,30\n";
    EXPECT_EQ(at.run({"import", "t", "-", "--create", "-q"}, text).code, 6);
    ASSERT_EQ(at.run({"import", "t", "-", "--create", "-q", "--on-conflict", "update"}, text).code, 0);
    EXPECT_EQ(rows_of(at, "t"), "1\t30\n2\t20\n");
    ASSERT_EQ(at.run({"import", "u", "-", "--create", "-q", "--on-conflict", "skip"}, text).code, 0);
    EXPECT_EQ(rows_of(at, "u"), "1\t10\n2\t20\n");
}

TEST(conflicts, of_keys_that_may_repeat_are_none_unless_updates_are_asked_for)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:multikey", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"import", "t", "-"}, "id,n\n1,10\n1,20\n").code, 0);
    EXPECT_EQ(at.run({"select", "t", "--count"}).out, "2\n");
    ASSERT_EQ(at.run({"import", "t", "-", "--on-conflict", "skip"}, "id,n\n1,30\n2,40\n").code, 0);
    EXPECT_EQ(rows_of(at, "t"), "1\t10\n1\t20\n2\t40\n");
}

TEST(conflicts, a_protected_column_is_not_updated)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "born:int32:protected", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1", "born=1999"}).code, 0);
    expect_result(at.run({"import", "t", "-", "--on-conflict", "update"}, "id,born,n\n1,2000,5\n"), 8,
                  "ktrg: t: standard input:2: column \"born\" is protected: it can't be updated [105]\n");
    EXPECT_EQ(at.run({"import", "t", "-", "--on-conflict", "update", "-q"}, "id,born,n\n1,,5\n").code, 0);
    EXPECT_EQ(rows_of(at, "t"), "1\t1999\t5\n");
}

// ---- Rejected rows ----

TEST(rejects, take_the_rows_that_do_not_fit_and_the_others_go_in)
{
    scratch at;
    make_hosts(at);
    const result end = at.run({"import", "hosts", "-", "--rejects", "bad.csv"},
                              "name,load,cpus\ngamma,1,2\n\"de,lta\",x,3\nalpha,1,1\nepsilon,2,\n");
    expect_result(end, 10,
                  "ktrg: hosts: standard input:3: column \"load\": \"x\" is not a float64\n"
                  "ktrg: hosts: standard input:4: a row with the key \"alpha\" exists [108]\n"
                  "ktrg: hosts: 2 rows were imported, 2 rejected\n"
                  "ktrg: hosts: the rejected rows and the reasons are in bad.csv\n");
    EXPECT_EQ(rows_of(at), std::string(hosts_rows) + "gamma\t1.0\t2\nepsilon\t2.0\t0\n");
    EXPECT_EQ(at.read("bad.csv"),
              "name,load,cpus,reject_reason\r\n"
              "\"de,lta\",x,3,\"standard input:3: column \"\"load\"\": \"\"x\"\" is not a float64\"\r\n"
              "alpha,1,1,\"standard input:4: a row with the key \"\"alpha\"\" exists\"\r\n");
}

TEST(rejects, can_be_mended_and_imported_again_without_the_reason)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(at.run({"import", "hosts", "-", "--rejects", "bad.jsonl", "--format", "jsonl"},
                     "{\"name\":\"gamma\",\"cpus\":\"two\",\"load\":null}\n")
                  .code,
              10);
    std::string bad = at.read("bad.jsonl");
    EXPECT_EQ(bad, "{\"name\":\"gamma\",\"cpus\":\"two\",\"load\":null,\"reject_reason\":\"standard input:1: column "
                   "\\\"cpus\\\": \\\"two\\\" is not an int64\"}\n");
    at.write("bad.jsonl", bad.replace(bad.find("\"two\""), 5, "2"));
    EXPECT_EQ(at.run({"import", "hosts", "bad.jsonl", "--map", "reject_reason="}).code, 0);
    EXPECT_EQ(rows_of(at), std::string(hosts_rows) + "gamma\t0.0\t2\n");
}

TEST(rejects, make_no_file_without_a_rejected_row_or_in_a_dry_run)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"import", "hosts", "-", "--rejects", "bad.csv"}, "name\ngamma\n").code, 0);
    EXPECT_FALSE(at.exists("bad.csv"));
    expect_result(at.run({"import", "hosts", "-", "--rejects", "bad.csv", "-n"}, "name,cpus\ndelta,x\nepsilon,1\n"), 10,
                  "ktrg: hosts: standard input:2: column \"cpus\": \"x\" is not an int64\n"
                  "ktrg: hosts: 1 row would be imported, 1 rejected\n");
    EXPECT_FALSE(at.exists("bad.csv"));
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
}

TEST(rejects, over_a_file_that_exists_need_force)
{
    scratch at;
    make_hosts(at);
    at.write("bad.csv", "mine");
    const std::string before = at.read("hosts");
    expect_result(at.run({"import", "hosts", "-", "--rejects", "bad.csv"}, "name\ngamma\n"), 6,
                  "ktrg: hosts: bad.csv: the file exists; --force replaces it\n");
    EXPECT_EQ(at.read("hosts"), before);
    EXPECT_EQ(at.run({"import", "hosts", "-", "--rejects", "bad.csv", "-f"}, "name\nalpha\n").code, 10);
    EXPECT_EQ(at.read("bad.csv").substr(0, 20), "name,reject_reason\r\n");
}

TEST(rejects, are_shown_ten_at_most)
{
    scratch     at;
    std::string text = "name,cpus\n";
    for (int i = 0; i < 30; i++)
        text += "x" + std::to_string(i) + ",many\n";
    make_hosts(at);
    const result end = at.run({"import", "hosts", "-", "--rejects", "bad.csv"}, text);
    EXPECT_EQ(end.code, 10);
    EXPECT_EQ(std::count(end.err.begin(), end.err.end(), '\n'), 12);
    const std::string bad = at.read("bad.csv");
    EXPECT_EQ(std::count(bad.begin(), bad.end(), '\n'), 31);
}

TEST(rejects, that_cannot_be_written_end_the_import_with_nothing_changed)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    EXPECT_EQ(at.run({"import", "hosts", "-", "--rejects", "nowhere/bad.csv"}, "name\ngamma\nalpha\n").code, 3);
    EXPECT_EQ(at.read("hosts"), before);
}

// ---- Batches ----

TEST(batches, are_a_transaction_each)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"import", "hosts", "-", "--batch", "2", "-q"}, "name\na\nb\nc\nd\ne\n").code, 0);
    EXPECT_EQ(at.run({"select", "hosts@5", "--count"}).out, "7\n");
    ASSERT_EQ(at.run({"import", "hosts", "-", "--batch", "2", "-q"}, "name\nf\ng\n").code, 0);
    EXPECT_EQ(at.run({"select", "hosts@6", "--count"}).out, "9\n");
    EXPECT_EQ(at.run({"import", "hosts", "-", "--batch", "0"}, "name\nx\n").code, 2);
}

TEST(batches, in_front_of_a_failure_stay_and_that_is_told)
{
    scratch at;
    make_hosts(at);
    expect_result(
        at.run({"import", "hosts", "-", "--batch", "2"}, "name\na\nb\nc\nalpha\nd\n"), 10,
        "ktrg: hosts: standard input:5: a row with the key \"alpha\" exists; 2 rows are in by earlier batches "
        "[108]\n");
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "4\n");
    expect_result(at.run({"import", "hosts", "-", "--batch", "2"}, "name\nalpha\n"), 6,
                  "ktrg: hosts: standard input:2: a row with the key \"alpha\" exists [108]\n");
    EXPECT_EQ(at.run({"import", "t", "-", "--create", "-q", "--batch", "1"}, "id,n\n1,2\n1,2\n").code, 10);
    EXPECT_EQ(rows_of(at, "t"), "1\t2\n");
    expect_result(at.run({"import", "hosts", "-", "--batch", "1", "-n"}, "name\nx\nalpha\n"), 6,
                  "ktrg: hosts: standard input:3: a row with the key \"alpha\" exists [108]\n");
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "4\n");
}

// ---- export ----

TEST(exporting, gives_what_import_takes_back)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "note:string", "tags:string[]", "secret:string:invisible"}).code,
              0);
    ASSERT_EQ(at.run({"put", "t", "id=-1", "note=a,\"b\"\n\tc\\d", "tags=[\"x,y\",\"\"]", "secret=s"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=2"}).code, 0);
    for (const std::string form : {"csv", "tsv", "json", "jsonl"}) {
        const result text = at.run({"export", "t", "-o", form});
        EXPECT_EQ(text.code, 0);
        EXPECT_EQ(text.err, "ktrg: t: 2 rows exported\n");
        ASSERT_EQ(
            at.run({"create", form, "id:int32:key", "note:string", "tags:string[]", "secret:string:invisible"}).code,
            0);
        EXPECT_EQ(at.run({"import", form, "-", "--format", form, "-q"}, text.out).err, "");
        EXPECT_EQ(at.run({"export", form, "-o", "json"}).out, at.run({"export", "t", "-o", "json"}).out) << form;
    }
}

TEST(exporting, is_csv_unless_told_otherwise)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"export", "hosts"}).out, "name,load,cpus\r\nalpha,0.25,4\r\nbeta,1.5,16\r\n");
    EXPECT_EQ(at.run({"export", "hosts", "-H", "-o", "tsv", "-c", "cpus,name"}).out, "4\talpha\n16\tbeta\n");
    EXPECT_EQ(at.run({"export", "hosts", "-o", "markdown", "-c", "name"}).out,
              "| name |\n| --- |\n| alpha |\n| beta |\n");
    EXPECT_EQ(at.run({"export", "hosts", "-o", "jsonl", "-c", "name"}).out,
              "{\"name\":\"alpha\"}\n{\"name\":\"beta\"}\n");
}

TEST(exporting, what_cannot_be_exported_is_told)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"export", "hosts", "-o", "table"}), 2,
                  "ktrg: hosts: export writes csv, tsv, json, jsonl or markdown; select shows rows to people\n");
    EXPECT_EQ(at.run({"export", "hosts", "-c", "nam"}).err,
              "ktrg: hosts: no column \"nam\" (did you mean \"name\"?) [105]\n");
    EXPECT_EQ(at.run({"export", "hots"}).code, 3);
    at.write("hosts", at.read("hosts").substr(0, 200));
    EXPECT_EQ(at.run({"export", "hosts"}).code, 4);
    EXPECT_EQ(at.run_program("/bin/sh", {"-c", std::string(KTRG_PROGRAM) + " export hosts@3 >/dev/full"}).code, 4);
}

TEST(verbose_import, tells_what_was_read_and_committed)
{
    scratch      at;
    const result end = at.run({"import", "t", "-", "--create", "-v", "-q"}, "id,n\n1,2\n");
    EXPECT_TRUE(std::regex_match(end.err,
                                 std::regex("ktrg: standard input: read: 1 row, 2 columns, 9 bytes, [0-9.]+ ms\n"
                                            "ktrg: t: created: 0 rows, 2 columns, [0-9]+ bytes, counter 1, [0-9.]+ ms\n"
                                            "ktrg: t: committed: 1 row, 2 columns, [0-9]+ bytes, counter 2, "
                                            "[0-9.]+ ms\n"
                                            "ktrg: [0-9.]+ ms in all\n")))
        << end.err;
}

} // namespace
