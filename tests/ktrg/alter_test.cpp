// SPDX-License-Identifier: MIT
// alter: other columns in one step; what can't be done is told ahead of it, and leaves the table byte for byte.
#include <csignal>
#include <thread>

#include <sys/stat.h>

#include "holder.h"
#include "program.h"
#include "registry.h"

using ktrg_test::holder;
using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(const scratch & at)
{
    const result made = at.run({"import", "hosts", "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

std::string schema_of(const scratch & at)
{
    return at.run({"schema", "hosts"}).out;
}

std::string rows_of(const scratch & at)
{
    return at.run({"select", "hosts", "-H", "-o", "tsv"}).out;
}

std::size_t names_in(const scratch & at)
{
    std::size_t count = 0;
    for (const std::string & name : ktrg::files_in(at.file(".")))
        count += name != "." && name != ".." && name != ",Lock" && name != ".io" ? 1 : 0;
    return count;
}

void expect_result(const result & end, int code, const std::string & err)
{
    EXPECT_EQ(end.code, code);
    EXPECT_EQ(end.out, "");
    EXPECT_EQ(end.err, err);
}

TEST(altering, adds_columns_with_their_defaults_in_the_rows_that_exist)
{
    scratch at;
    make_hosts(at);
    expect_result(
        at.run({"alter", "hosts", "--add", "site:string=home,tags:string[]", "--add", "n:int32:protected=-1"}), 0,
        "ktrg: hosts: 3 columns added (2 rows)\n");
    EXPECT_EQ(schema_of(at), "name:string:key\nload:float64\ncpus:int64\nsite:string=home\ntags:string[]\n"
                             "n:int32:protected=-1\n");
    EXPECT_EQ(rows_of(at), "alpha\t0.25\t4\thome\t[]\t-1\nbeta\t1.5\t16\thome\t[]\t-1\n");
    EXPECT_EQ(names_in(at), 1U);
}

TEST(altering, drops_columns_with_their_values)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"alter", "hosts", "--drop", "load,cpus"}), 0, "ktrg: hosts: 2 columns dropped (2 rows)\n");
    EXPECT_EQ(rows_of(at), "alpha\nbeta\n");
}

TEST(altering, renames_columns_the_key_too_and_exchanges_names)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"alter", "hosts", "--rename", "name=host"}), 0, "ktrg: hosts: 1 column renamed (2 rows)\n");
    expect_result(at.run({"alter", "hosts", "--rename", "load=cpus,cpus=load"}), 0,
                  "ktrg: hosts: 2 columns renamed (2 rows)\n");
    EXPECT_EQ(schema_of(at), "host:string:key\ncpus:float64\nload:int64\n");
    EXPECT_EQ(rows_of(at), "alpha\t0.25\t4\nbeta\t1.5\t16\n");
    EXPECT_EQ(at.run({"alter", "hosts", "--rename", "host=cpus,cpus=load,load=host"}).code, 0);
    EXPECT_EQ(schema_of(at), "cpus:string:key\nload:float64\nhost:int64\n");
    EXPECT_EQ(at.run({"alter", "hosts", "--rename", "load=a,cpus=load,host=host"}).code, 0);
    EXPECT_EQ(schema_of(at), "load:string:key\na:float64\nhost:int64\n");
}

TEST(altering, changes_defaults_for_rows_to_come_only)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"alter", "hosts", "--default", "load=0.5", "--default", "cpus=2"}), 0,
                  "ktrg: hosts: 2 defaults changed (2 rows)\n");
    ASSERT_EQ(at.run({"put", "hosts", "name=gamma"}).code, 0);
    EXPECT_EQ(rows_of(at), "alpha\t0.25\t4\nbeta\t1.5\t16\ngamma\t0.5\t2\n");
    ASSERT_EQ(at.run({"alter", "hosts", "--default", "load="}).code, 0);
    EXPECT_EQ(schema_of(at), "name:string:key\nload:float64\ncpus:int64=2\n");
}

TEST(altering, does_all_at_once_by_the_names_of_before_and_counts_as_one_change)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"alter", "hosts@2", "--add", "cpus:string=many", "--drop", "cpus", "--rename", "load=load1",
                          "--default", "load=0.5"}),
                  0, "ktrg: hosts: 1 column added, 1 column dropped, 1 column renamed, 1 default changed (2 rows)\n");
    EXPECT_EQ(schema_of(at), "name:string:key\nload1:float64=0.5\ncpus:string=many\n");
    EXPECT_EQ(rows_of(at), "alpha\t0.25\tmany\nbeta\t1.5\tmany\n");
    EXPECT_EQ(at.run({"select", "hosts@3", "--count"}).out, "2\n");
}

TEST(altering, keeps_the_blob)
{
    scratch at;
    make_hosts(at);
    const ktrg::place where = ktrg::find_place(at.file("hosts"));
    {
        ktrg::table holds = ktrg::table::open_for_writing(where, 0);
        holds.set_blob({1, 2, 0, 255});
        holds.commit();
    }
    ASSERT_EQ(at.run({"alter", "hosts", "--drop", "load"}).code, 0);
    EXPECT_EQ(ktrg::table::open_for_reading(where).blob(), (std::vector<unsigned char>{1, 2, 0, 255}));
}

TEST(altering, leaves_a_table_that_goes_on_being_written)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(at.run({"rm", "hosts", "alpha"}).code, 0);
    ASSERT_EQ(at.run({"alter", "hosts", "--add", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"put", "hosts", "name=gamma", "n=7"}).code, 0);
    ASSERT_EQ(at.run({"put", "hosts", "name=beta", "n=8"}).code, 0);
    EXPECT_EQ(rows_of(at), "beta\t1.5\t16\t8\ngamma\t0.0\t0\t7\n");
    EXPECT_EQ(at.run({"stat", "hosts"}).code, 0);
}

TEST(altering, a_dry_run_shows_the_new_schema_and_changes_nothing)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    const result      shown =
        at.run({"alter", "hosts", "-n", "--drop", "cpus", "--rename", "load=load1", "--add", "n:int32"});
    EXPECT_EQ(shown.code, 0);
    EXPECT_EQ(shown.out, "name:string:key\nload1:float64\nn:int32\n");
    EXPECT_EQ(shown.err, "");
    EXPECT_EQ(at.run({"alter", "hosts", "-n", "--drop", "cpus", "-o", "csv"}).out,
              "name,type,flags,default\r\nname,string,key,\r\nload,float64,,\r\n");
    EXPECT_EQ(at.read("hosts"), before);
    EXPECT_EQ(names_in(at), 1U);
}

TEST(altering, what_cannot_be_done_is_told_and_changes_nothing)
{
    scratch at;
    make_hosts(at);
    const std::string before  = at.read("hosts");
    const auto        refusal = [&at](std::vector<std::string> options) {
        options.insert(options.begin(), {"alter", "hosts"});
        const result end = at.run(options);
        EXPECT_EQ(end.code, 2);
        return end.err;
    };
    EXPECT_EQ(refusal({}), "ktrg: hosts: alter wants --add, --drop, --rename or --default\n");
    EXPECT_EQ(refusal({"--drop", "lod"}), "ktrg: hosts: no column \"lod\" (did you mean \"load\"?) [105]\n");
    EXPECT_EQ(refusal({"--rename", "lod=x"}), "ktrg: hosts: no column \"lod\" (did you mean \"load\"?) [105]\n");
    EXPECT_EQ(refusal({"--default", "lod=x"}), "ktrg: hosts: no column \"lod\" (did you mean \"load\"?) [105]\n");
    EXPECT_EQ(refusal({"--drop", "name"}), "ktrg: hosts: column \"name\" is the key: it can't be dropped [105]\n");
    EXPECT_EQ(refusal({"--drop", "load,load"}), "ktrg: hosts: column \"load\" is dropped twice [105]\n");
    EXPECT_EQ(refusal({"--drop", "load", "--rename", "load=x"}),
              "ktrg: hosts: column \"load\" is dropped: --rename has nothing to change [105]\n");
    EXPECT_EQ(refusal({"--rename", "load=x,load=y"}), "ktrg: hosts: column \"load\" is renamed twice [105]\n");
    EXPECT_EQ(refusal({"--rename", "load=cpus"}), "ktrg: hosts: two columns would have the name \"cpus\" [106]\n");
    EXPECT_EQ(refusal({"--rename", "load=2nd"}), "ktrg: hosts: no column can have the name \"2nd\": a letter, then "
                                                 "letters, digits and \"_\", 255 at most [105]\n");
    EXPECT_EQ(refusal({"--rename", "load"}), "ktrg: hosts: --rename wants FROM=TO, not \"load\"\n");
    EXPECT_EQ(refusal({"--default", "load=fast"}),
              "ktrg: hosts: the default of \"load\": \"fast\" is not a float64 [105]\n");
    EXPECT_EQ(refusal({"--default", "load=1", "--default", "load=2"}),
              "ktrg: hosts: column \"load\" has two defaults [105]\n");
    EXPECT_EQ(refusal({"--add", "load:int32"}), "ktrg: hosts: two columns would have the name \"load\" [106]\n");
    EXPECT_EQ(refusal({"--add", "id:int32:key"}),
              "ktrg: hosts: column \"id\" can't be added as a key: the key is \"name\" [108]\n");
    EXPECT_EQ(refusal({"--add", "n:int32=x"}), "ktrg: hosts: the default of \"n\": \"x\" is not an int32 [105]\n");
    EXPECT_EQ(refusal({"--add", "n"}), "ktrg: a column is name:type[:flags][=default], not \"n\" [105]\n");
    EXPECT_EQ(at.read("hosts"), before);
    EXPECT_EQ(names_in(at), 1U);
}

TEST(altering, with_an_invisible_column_adds_and_drops_only)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "hosts", "id:int32:key", "secret:string:invisible", "n:int32"}).code, 0);
    EXPECT_EQ(at.run({"alter", "hosts", "--rename", "n=m"}).err,
              "ktrg: hosts: --rename can't be done while the table has the invisible column \"secret\" [105]\n");
    EXPECT_EQ(at.run({"alter", "hosts", "--default", "n=1"}).code, 2);
    EXPECT_EQ(at.run({"alter", "hosts", "--drop", "secret"}).err,
              "ktrg: hosts: column \"secret\" is invisible: it can't be dropped [105]\n");
    EXPECT_EQ(at.run({"alter", "hosts", "--drop", "n", "--add", "m:int32"}).code, 0);
    EXPECT_EQ(schema_of(at), "id:int32:key\nsecret:string:invisible\nm:int32\n");
}

TEST(altering, what_is_not_there_damaged_held_or_moved_on_is_told)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"alter", "hots", "--drop", "load"}).code, 3);
    EXPECT_EQ(at.run({"alter", "hosts@1", "--drop", "load"}).code, 6);
    const std::string before = at.read("hosts");
    {
        const holder other(at.file("hosts"));
        expect_result(at.run({"alter", "hosts", "--drop", "load"}), 5,
                      "ktrg: hosts: another process holds the table; --wait SECONDS waits for it\n");
    }
    at.write(",Lock", "");
    {
        const holder other(at.file(",Lock"));
        EXPECT_EQ(at.run({"alter", "hosts", "--drop", "load"}).code, 5);
    }
    ASSERT_EQ(chmod(at.file(".").c_str(), 0555), 0);
    expect_result(at.run({"alter", "hosts", "--drop", "load"}), 8,
                  "ktrg: hosts: no permission to write in \".\" [206]\n");
    ASSERT_EQ(chmod(at.file(".").c_str(), 0755), 0);
    EXPECT_EQ(at.read("hosts"), before);
    EXPECT_EQ(names_in(at), 1U);
    at.write("hosts", before.substr(0, 200));
    EXPECT_EQ(at.run({"alter", "hosts", "--drop", "load"}).code, 4);
}

TEST(altering, that_is_interrupted_leaves_the_table_as_it_was)
{
    scratch at;
    make_hosts(at);
    const std::string      before = at.read("hosts");
    const holder           other(at.file("hosts"));
    const scratch::running alter = at.start({"alter", "hosts", "--drop", "load", "--wait", "30"});
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    kill(alter.pid, SIGINT);
    EXPECT_EQ(at.finish(alter).code, 130);
    EXPECT_EQ(at.read("hosts"), before);
    EXPECT_EQ(names_in(at), 1U);
}

TEST(altering, that_is_killed_at_any_moment_leaves_the_old_table_or_the_new_one_and_repair_the_rest)
{
    const std::string old_schema = "id:int64:key\nn:int64\n";
    const std::string new_schema = old_schema + "note:string=x\n";
    scratch           at;
    std::string       text = "id,n\n";
    for (int i = 0; i < 2000; i++)
        text += std::to_string(i) + ",1\n";
    for (int moment = 0; moment < 12; moment++) {
        ASSERT_EQ(at.run({"import", "hosts", "-", "--create", "-q"}, text).code, 0);
        const scratch::running alter = at.start({"alter", "hosts", "--add", "note:string=x"});
        std::this_thread::sleep_for(std::chrono::milliseconds(8 * moment));
        kill(alter.pid, SIGKILL);
        (void)at.finish(alter);
        const std::string schema = schema_of(at);
        EXPECT_TRUE(schema == old_schema || schema == new_schema) << schema;
        EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "2000\n");
        EXPECT_EQ(at.run({"repair", ".", "-q"}).code, 0);
        EXPECT_EQ(names_in(at), 1U) << moment;
        ASSERT_EQ(at.run({"drop", "hosts", "-f"}).code, 0);
    }
}

TEST(altering, without_room_on_the_disk_is_7_and_leaves_the_table_as_it_was)
{
    scratch     at;
    std::string text = "id,n\n";
    for (int i = 0; i < 200; i++)
        text += std::to_string(i) + ",1\n";
    ASSERT_EQ(at.run({"import", "hosts", "-", "--create"}, text).code, 0);
    const std::string before = at.read("hosts");
    // Room for less than the copy, for the copy alone, and for all.
    const std::string one_half = std::to_string(before.size() / 512 / 2);
    const std::string copy     = std::to_string(before.size() / 512 + 1);
    for (const std::string & blocks : {one_half, copy}) {
        const std::string limited = "trap '' XFSZ; ulimit -f " + blocks + "; exec " + KTRG_PROGRAM;
        EXPECT_EQ(at.run_program("/bin/sh", {"-c", limited + " alter hosts --add note:string=abcdefghijklmnop"}).code,
                  7);
        EXPECT_EQ(at.read("hosts"), before);
        EXPECT_EQ(names_in(at), 1U);
    }
}

} // namespace
