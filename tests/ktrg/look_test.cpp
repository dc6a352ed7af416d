// SPDX-License-Identifier: MIT
// ls, schema, stat, get, select, names of tables, the command line, and tables that other processes hold.
#include <chrono>
#include <thread>

#include <csignal>
#include <nlohmann/json.hpp>
#include <unistd.h>

#include "failure.h"
#include "holder.h"
#include "kt_rg.h"
#include "program.h"

using ktrg_test::holder;
using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(scratch & at, const std::string & table = "hosts")
{
    const result made =
        at.run({"import", table, "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\nab,-3,8\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

// ---- get and select ----

TEST(getting, rows_come_in_the_order_of_the_keys)
{
    scratch at;
    make_hosts(at);
    const result rows = at.run({"get", "hosts", "beta", "alpha", "-o", "csv"});
    EXPECT_EQ(rows.code, 0);
    EXPECT_EQ(rows.out, "name,load,cpus\r\nbeta,1.5,16\r\nalpha,0.25,4\r\n");
}

TEST(getting, many_keys_are_found_as_well_as_few)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"get", "hosts", "beta", "x1", "x2", "x3", "x4", "x5", "ab", "-H", "-o", "csv", "-c", "name"}).out,
              "beta\r\nab\r\n");
}

TEST(getting, no_row_at_all_ends_with_1_and_says_which_keys)
{
    scratch at;
    make_hosts(at);
    const result rows = at.run({"get", "hosts", "gamma", "-o", "json"});
    EXPECT_EQ(rows.code, 1);
    EXPECT_EQ(rows.out, "[]\n");
    EXPECT_EQ(rows.err, "ktrg: hosts: no row with the key \"gamma\" [202]\n");
}

TEST(getting, keys_of_each_type_are_understood_and_negative_ones_need_no_trick)
{
    scratch at;
    for (const std::string type : {"int32", "int64", "float32", "float64"}) {
        ASSERT_EQ(at.run({"import", type, "-", "--create", "--types", "id:" + type}, "id,n\n-5,1\n6,2\n").code, 0);
        EXPECT_EQ(at.run({"get", type, "-5", "-o", "jsonl", "-c", "n"}).out, "{\"n\":1}\n") << type;
        EXPECT_EQ(at.run({"get", type, "1", "2", "3", "4", "6", "-o", "jsonl", "-c", "n"}).out, "{\"n\":2}\n") << type;
    }
    const std::string handle = "0x0001 0x0002 0x00000003 0x00000004 0x00000005 0x00000006";
    ASSERT_EQ(at.run({"import", "handles", "-", "--create", "--types", "id:handle"}, "id,n\n" + handle + ",1\n").code,
              0);
    EXPECT_EQ(at.run({"get", "handles", handle, "-o", "jsonl", "-c", "n"}).out, "{\"n\":1}\n");
}

TEST(getting, a_key_that_is_none_is_a_usage_error)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "numbers", "-", "--create"}, "id,n\n1,2\n").code, 0);
    const result rows = at.run({"get", "numbers", "1", "one"});
    EXPECT_EQ(rows.code, 2);
    EXPECT_EQ(rows.out, "");
    EXPECT_EQ(rows.err, "ktrg: numbers: the key \"id\": \"one\" is not an int64\n");
}

TEST(selecting, columns_are_chosen_and_ordered_by_the_user)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"select", "hosts", "-c", "cpus,name", "-o", "csv"}).out,
              "cpus,name\r\n4,alpha\r\n16,beta\r\n8,ab\r\n");
    const result wrong = at.run({"select", "hosts", "--columns", "nam"});
    EXPECT_EQ(wrong.code, 2);
    EXPECT_EQ(wrong.err, "ktrg: hosts: no column \"nam\" (did you mean \"name\"?) [105]\n");
}

TEST(selecting, rows_are_sorted_by_value_and_limited_behind_that)
{
    scratch at;
    make_hosts(at);
    const auto names = [&](const std::vector<std::string> & options) {
        std::vector<std::string> arguments = {"select", "hosts", "-c", "name", "-H", "-o", "tsv"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        return at.run(arguments).out;
    };
    EXPECT_EQ(names({"--sort", "cpus"}), "alpha\nab\nbeta\n");
    EXPECT_EQ(names({"--sort", "-cpus"}), "beta\nab\nalpha\n");
    EXPECT_EQ(names({"--sort", "load"}), "ab\nalpha\nbeta\n");
    EXPECT_EQ(names({"--sort", "name"}), "ab\nalpha\nbeta\n");
    EXPECT_EQ(names({"--sort", "-name", "--limit", "2"}), "beta\nalpha\n");
    EXPECT_EQ(names({"--limit", "0"}), "");
}

TEST(selecting, sorting_is_exact_at_the_edges_of_64_bits_and_puts_nan_last)
{
    scratch at;
    ASSERT_EQ(
        at.run({"import", "a", "-", "--create", "--types", "i:int64,r:float64"},
               "name,i,r\na,9223372036854775807,nan\nb,-9223372036854775808,inf\nc,9223372036854775806,-1\nd,-1,0.5\n")
            .code,
        0);
    EXPECT_EQ(at.run({"select", "a", "-s", "i", "-c", "name", "-H", "-o", "tsv"}).out, "b\nd\nc\na\n");
    EXPECT_EQ(at.run({"select", "a", "-s", "r", "-c", "name", "-H", "-o", "tsv"}).out, "c\nd\nb\na\n");
}

TEST(selecting, count_is_a_number_and_an_object_in_json)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
    EXPECT_EQ(at.run({"select", "hosts", "--count", "-o", "json"}).out, "[\n {\"count\":3}\n]\n");
}

TEST(selecting, talk_goes_to_standard_error_and_quiet_ends_it)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"select", "hosts"}).err, "ktrg: 3 rows\n");
    EXPECT_EQ(at.run({"select", "hosts", "-q"}).err, "");
    EXPECT_EQ(at.run({"select", "hosts", "-o", "json"}).err, "");
}

// ---- ls, schema, stat ----

TEST(listing, shows_tables_and_passes_over_everything_else)
{
    scratch at;
    make_hosts(at, "hosts");
    make_hosts(at, "net,hosts");
    at.write("README.md", "not a table");
    at.write("notes", "not a table either, though its name could be one's");
    at.write(",Lock", "");
    at.write("hosts.rewrite", at.read("hosts"));
    const auto listed = nlohmann::json::parse(at.run({"ls", "-o", "json"}).out);
    ASSERT_EQ(listed.size(), 2U);
    EXPECT_EQ(listed[0]["table"], "hosts");
    EXPECT_EQ(listed[0]["rows"], 3);
    EXPECT_EQ(listed[0]["columns"], 3);
    EXPECT_EQ(listed[0]["counter"], 2);
    EXPECT_EQ(listed[0]["bytes"], at.read("hosts").size());
    EXPECT_EQ(listed[1]["table"], "net,hosts");
}

TEST(listing, a_damaged_table_is_listed_and_told_and_the_rest_goes_on)
{
    scratch at;
    make_hosts(at, "bad");
    make_hosts(at, "good");
    at.write("bad", at.read("bad").substr(0, 150));
    const result listing = at.run({"ls", "-o", "json"});
    EXPECT_EQ(listing.code, 4);
    const auto listed = nlohmann::json::parse(listing.out);
    ASSERT_EQ(listed.size(), 2U);
    EXPECT_TRUE(listed[0]["rows"].is_null());
    EXPECT_EQ(listed[1]["rows"], 3);
    EXPECT_NE(listing.err.find("bad: the file is damaged"), std::string::npos);
}

TEST(listing, a_directory_that_is_not_there_ends_with_3)
{
    scratch at;
    EXPECT_EQ(at.run({"ls", "nowhere"}).code, 3);
}

TEST(schema, in_json_tells_types_keys_flags_and_defaults)
{
    scratch at;
    ASSERT_EQ(
        at.run({"import", "a", "-", "--create", "--types", "n:uint32:protected:reset=7,s:struct(x:int32,y:string[])"},
               "name,n,s\nx,1,{}\n")
            .code,
        0);
    const auto schema = nlohmann::json::parse(at.run({"schema", "a", "-o", "json"}).out);
    EXPECT_EQ(schema["table"], "a");
    EXPECT_EQ(schema["key"], "name");
    EXPECT_EQ(schema["columns"][0]["key"], true);
    EXPECT_EQ(schema["columns"][1]["flags"], (std::vector<std::string>{"protected", "reset"}));
    EXPECT_EQ(schema["columns"][1]["default"], "7");
    EXPECT_EQ(schema["columns"][2]["fields"][1]["type"], "string[]");
    EXPECT_EQ(at.run({"schema", "a"}).out,
              "name:string:key\nn:uint32:protected:reset=7\ns:struct(x:int32,y:string[])\n");
}

TEST(stat, the_kinds_of_bytes_add_up_to_the_file)
{
    scratch at;
    make_hosts(at);
    const auto stat = nlohmann::json::parse(at.run({"stat", "hosts", "-o", "json"}).out)[0];
    EXPECT_EQ(stat["file_bytes"], at.read("hosts").size());
    EXPECT_EQ(stat["live_bytes"].get<int>() + stat["superseded_bytes"].get<int>() + stat["dead_bytes"].get<int>(),
              stat["file_bytes"].get<int>());
    EXPECT_EQ(stat["rows"], 3);
    EXPECT_EQ(stat["counter"], 2);
    EXPECT_EQ(stat["superseded_commit_bytes"], 24);
    EXPECT_TRUE(stat["blob_bytes"].is_null());
}

TEST(stat, shows_what_a_killed_writer_left_as_dead_and_the_table_stands_at_its_last_commit)
{
    scratch at;
    make_hosts(at);
    const std::size_t before = at.read("hosts").size();
    EXPECT_EQ(at.run_program(KILLED_WRITER_PROGRAM, {".", "hosts", "name", "50"}).code, 128 + SIGKILL);
    const std::size_t after = at.read("hosts").size();
    ASSERT_GT(after, before);
    const auto stat = nlohmann::json::parse(at.run({"stat", "hosts", "-o", "json"}).out)[0];
    EXPECT_EQ(stat["dead_tail_bytes"], after - before);
    EXPECT_EQ(stat["rows"], 3);
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
    ASSERT_EQ(at.run({"import", "hosts", "-"}, "name\ngamma\n").code, 0);
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "4\n");
}

// ---- Names ----

TEST(names, without_a_slash_are_looked_for_in_ktrg_root)
{
    scratch at;
    at.write("state/x", "");
    make_hosts(at, "state/hosts");
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).code, 3);
    at.environment = {"KTRG_ROOT=state"};
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
    EXPECT_EQ(at.run({"ls", "-H", "-q", "-o", "tsv"}).out.substr(0, 8), "hosts\t3\t");
    EXPECT_EQ(at.run({"select", "./hosts", "--count"}).code, 3);
    EXPECT_EQ(at.run({"select", "state/hosts", "--count"}).out, "3\n");
}

TEST(names, a_comma_in_a_file_name_is_a_slash_of_its_registry_path)
{
    scratch at;
    make_hosts(at, "net,hosts");
    EXPECT_TRUE(at.exists("net,hosts"));
    EXPECT_EQ(at.run({"select", "net,hosts", "--count"}).out, "3\n");
}

TEST(names, that_no_registry_path_has_are_refused_with_102)
{
    scratch at;
    for (const std::string name : {"hosts.csv", "a-b", "a b", ",Lock", "a,,b", "\xc3\xa4", "x.rewrite"}) {
        const result end = at.run({"select", name});
        EXPECT_EQ(end.code, 2) << name;
        EXPECT_NE(end.err.find("[102]"), std::string::npos) << end.err;
    }
    EXPECT_EQ(at.run({"select", std::string(253, 'a')}).code, 2);
    EXPECT_EQ(at.run({"select", std::string(252, 'a')}).code, 3);
}

TEST(names, a_directory_is_told_from_a_table)
{
    scratch at;
    at.write("state/x", "");
    const result end = at.run({"select", "state"});
    EXPECT_EQ(end.code, 2);
    EXPECT_EQ(end.err, "ktrg: state: a directory, not a table; `ktrg ls state` lists its tables\n");
}

TEST(names, a_counter_behind_an_at_sign_is_demanded)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"select", "hosts@2", "--count"}).out, "3\n");
    const result moved = at.run({"select", "hosts@1", "--count"});
    EXPECT_EQ(moved.code, 6);
    EXPECT_EQ(moved.err, "ktrg: hosts: the change counter is 2, not 1: the table has changed\n");
    EXPECT_EQ(at.run({"select", "hosts@two"}).code, 2);
}

// ---- The command line ----

TEST(command_line, unknown_verbs_and_options_end_with_2_and_a_hint)
{
    scratch      at;
    const result verb = at.run({"slect", "hosts"});
    EXPECT_EQ(verb.code, 2);
    EXPECT_EQ(verb.err, "ktrg: no verb \"slect\" (did you mean \"select\"?); `ktrg --help` lists them\n");
    EXPECT_EQ(at.run({"select", "hosts", "--frobnicate"}).code, 2);
    EXPECT_EQ(at.run({"get", "hosts"}).code, 2);
    EXPECT_EQ(at.run({"select", "hosts", "-o", "xml"}).code, 2);
    EXPECT_EQ(at.run({"select", "hosts", "--limit", "-3"}).code, 2);
    EXPECT_EQ(at.run({}).code, 2);
}

TEST(command_line, help_and_version_go_to_standard_output)
{
    scratch at;
    EXPECT_EQ(at.run({"--version"}).out, "ktrg 1.0.0\n");
    const result help = at.run({"import", "--help"});
    EXPECT_EQ(help.code, 0);
    EXPECT_NE(help.out.find("--types"), std::string::npos);
    EXPECT_NE(at.run({"--help"}).out.find("import"), std::string::npos);
}

TEST(command_line, common_options_stand_anywhere)
{
    scratch at;
    make_hosts(at);
    const std::string json = at.run({"select", "hosts", "-o", "json"}).out;
    EXPECT_EQ(at.run({"-o", "json", "select", "hosts"}).out, json);
    EXPECT_EQ(at.run({"select", "-o", "json", "hosts"}).out, json);
}

TEST(command_line, errors_come_as_json_on_request)
{
    scratch      at;
    const result end = at.run({"select", "state/hosts", "--errors", "json"});
    EXPECT_EQ(end.code, 3);
    const auto error = nlohmann::json::parse(end.err);
    EXPECT_EQ(error["table"], "state/hosts");
    EXPECT_EQ(error["code"], 200);
    EXPECT_EQ(error["exit"], 3);
}

TEST(exit_codes, stand_for_the_codes_of_the_registry)
{
    using ktrg::exit_code;
    using ktrg::exit_code_of;
    for (const kt_int32_t code : {102, 104, 105, 106, 107, 109})
        EXPECT_EQ(exit_code_of(code), exit_code::usage) << code;
    for (const kt_int32_t code : {14, 213, 214, 215})
        EXPECT_EQ(exit_code_of(code), exit_code::damaged) << code;
    for (const kt_int32_t code : {10, 12, 13, 16})
        EXPECT_EQ(exit_code_of(code), exit_code::input_output) << code;
    for (const kt_int32_t code : {202, 203, 204, 205})
        EXPECT_EQ(exit_code_of(code), exit_code::plain_no) << code;
    for (const kt_int32_t code : {108, 201})
        EXPECT_EQ(exit_code_of(code), exit_code::conflict) << code;
    EXPECT_EQ(exit_code_of(200), exit_code::not_found);
    EXPECT_EQ(exit_code_of(206), exit_code::not_permitted);
    EXPECT_EQ(exit_code_of(15), exit_code::internal);
    EXPECT_EQ(exit_code_of(12345), exit_code::internal);
}

TEST(exit_codes, a_damaged_table_ends_with_4)
{
    scratch at;
    make_hosts(at);
    at.write("hosts", at.read("hosts").substr(0, 200));
    for (const std::string verb : {"select", "schema", "stat"}) {
        const result end = at.run({verb, "hosts"});
        EXPECT_EQ(end.code, verb == "schema" ? 0 : 4) << verb << end.err; // the columns are sound
    }
    at.write("hosts", "twelve bytes");
    EXPECT_EQ(at.run({"schema", "hosts"}).code, 4);
    EXPECT_EQ(at.run({"import", "hosts", "-"}, "name\nx\n").code, 4);
}

// ---- Other processes ----

TEST(a_held_table, is_busy_for_a_writer_at_once)
{
    scratch at;
    make_hosts(at);
    const holder other(at.file("hosts"));
    const auto   started = std::chrono::steady_clock::now();
    const result end     = at.run({"import", "hosts", "-"}, "name\ngamma\n");
    EXPECT_EQ(end.code, 5);
    EXPECT_EQ(end.err, "ktrg: hosts: another process holds the table; --wait SECONDS waits for it\n");
    EXPECT_LT(std::chrono::steady_clock::now() - started, std::chrono::seconds(5));
}

TEST(a_held_table, can_be_read)
{
    scratch at;
    make_hosts(at);
    const holder other(at.file("hosts"));
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "3\n");
    EXPECT_EQ(at.run({"get", "hosts", "alpha", "-q"}).code, 0);
    EXPECT_EQ(at.run({"ls"}).code, 0);
    EXPECT_EQ(at.run({"stat", "hosts"}).code, 0);
}

TEST(a_held_table, is_waited_for_on_request)
{
    scratch at;
    make_hosts(at);
    holder                 other(at.file("hosts"));
    const scratch::running import = at.start({"import", "hosts", "-", "--wait", "30"});
    ASSERT_GT(write(import.input, "name\ngamma\n", 11), 0);
    close(dup(import.input));
    std::thread  later([&other] {
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        other.let_go();
    });
    const result end = at.finish(import);
    later.join();
    EXPECT_EQ(end.code, 0) << end.err;
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "4\n");
    const holder again(at.file("hosts"));
    EXPECT_EQ(at.run({"import", "hosts", "-", "--wait", "0.1"}, "name\ndelta\n").code, 5);
}

} // namespace
