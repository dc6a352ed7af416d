// SPDX-License-Identifier: MIT
// cp, mv, drop and repair: whole tables come and go in one step, and what destroys wants to be told so.
#include <chrono>
#include <csignal>
#include <regex>
#include <thread>

#include <sys/stat.h>
#include <unistd.h>

#include "holder.h"
#include "program.h"

using ktrg_test::holder;
using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

void make_hosts(const scratch & at, const std::string & table = "hosts")
{
    if (table.find('/') != std::string::npos)
        at.write(table.substr(0, table.find('/')) + "/.keep", "");
    const result made = at.run({"import", table, "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

void make_other(const scratch & at, const std::string & table = "other")
{
    ASSERT_EQ(at.run({"import", table, "-", "--create"}, "id,n\n1,2\n").code, 0);
}

std::string rows_of(const scratch & at, const std::string & table)
{
    return at.run({"select", table, "-H", "-o", "tsv"}).out;
}

const char * const hosts_rows = "alpha\t0.25\t4\nbeta\t1.5\t16\n";
const char * const other_rows = "1\t2\n";

std::string counter_of(const scratch & at, const std::string & table)
{
    std::smatch       found;
    const std::string out = at.run({"stat", table, "-o", "jsonl"}).out;
    return std::regex_search(out, found, std::regex("\"counter\":([0-9]+)")) ? found[1].str() : "none";
}

void expect_result(const result & end, int code, const std::string & err)
{
    EXPECT_EQ(end.code, code);
    EXPECT_EQ(end.out, "");
    EXPECT_EQ(end.err, err);
}

// ---- cp ----

TEST(copying, gives_a_table_with_the_rows_columns_and_counter_of_its_source)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(at.run({"put", "hosts", "name=beta", "load=1.5"}).code, 0);
    expect_result(at.run({"cp", "hosts", "copy"}), 0, "ktrg: hosts: copied to copy (2 rows)\n");
    EXPECT_EQ(rows_of(at, "copy"), hosts_rows);
    EXPECT_EQ(at.run({"schema", "copy"}).out, at.run({"schema", "hosts"}).out);
    EXPECT_EQ(counter_of(at, "copy"), "3");
    EXPECT_EQ(counter_of(at, "hosts"), "3");
    EXPECT_FALSE(at.exists("copy.rewrite"));
}

TEST(copying, leaves_the_dead_bytes_of_the_source_behind)
{
    scratch at;
    make_hosts(at);
    for (int i = 0; i < 5; i++)
        ASSERT_EQ(at.run({"put", "hosts", "name=beta", "load=1.5"}).code, 0);
    ASSERT_EQ(at.run({"cp", "hosts", "copy"}).code, 0);
    EXPECT_LT(at.read("copy").size(), at.read("hosts").size());
    EXPECT_EQ(at.run({"stat", "copy", "-o", "jsonl"}).out.find("\"superseded_bytes\":0,") == std::string::npos, false);
}

TEST(copying, into_a_directory_keeps_the_name)
{
    scratch at;
    make_hosts(at, "net,hosts");
    at.write("backup/x", "");
    expect_result(at.run({"cp", "net,hosts", "backup"}), 0, "ktrg: net,hosts: copied to backup/net,hosts (2 rows)\n");
    EXPECT_EQ(rows_of(at, "backup/net,hosts"), hosts_rows);
    at.environment = {"KTRG_ROOT=backup"};
    at.write("backup/old/x", "");
    expect_result(at.run({"cp", "net,hosts", "old"}), 0, "ktrg: net,hosts: copied to backup/old/net,hosts (2 rows)\n");
}

TEST(copying, over_a_table_that_exists_needs_force)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    const std::string before = at.read("other");
    expect_result(at.run({"cp", "hosts", "other"}), 6, "ktrg: other: the table exists; --force replaces it [201]\n");
    EXPECT_EQ(at.read("other"), before);
    expect_result(at.run({"cp", "hosts", "other", "-f"}), 0, "ktrg: hosts: copied over other (2 rows)\n");
    EXPECT_EQ(rows_of(at, "other"), hosts_rows);
}

TEST(copying, over_an_empty_file_needs_no_force)
{
    scratch at;
    make_hosts(at);
    at.write("copy", "");
    expect_result(at.run({"cp", "hosts", "copy"}), 0, "ktrg: hosts: copied to copy (2 rows)\n");
}

TEST(copying, onto_itself_is_refused_by_whatever_path)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    expect_result(at.run({"cp", "hosts", "./hosts", "-f"}), 2, "ktrg: hosts: source and target are the same file\n");
    ASSERT_EQ(symlink(".", at.file("here").c_str()), 0);
    expect_result(at.run({"cp", "hosts", "here/hosts", "-f"}), 2, "ktrg: hosts: source and target are the same file\n");
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(copying, a_dry_run_checks_everything_and_writes_nothing)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    expect_result(at.run({"cp", "hosts", "copy", "-n"}), 0, "ktrg: hosts: would be copied to copy (2 rows)\n");
    EXPECT_EQ(at.run({"cp", "hosts", "other", "-n"}).code, 6);
    expect_result(at.run({"cp", "hosts", "other", "-n", "-f"}), 0,
                  "ktrg: hosts: would be copied over other (2 rows)\n");
    EXPECT_EQ(rows_of(at, "other"), other_rows);
    EXPECT_FALSE(at.exists("copy"));
    EXPECT_FALSE(at.exists(",Lock"));
}

TEST(copying, what_is_not_there_or_damaged_is_told_and_leaves_no_target)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"cp", "hots", "copy"}), 3, "ktrg: hots: no such table (did you mean \"hosts\"?) [200]\n");
    expect_result(at.run({"cp", "hosts", "nowhere/copy"}), 3, "ktrg: nowhere/copy: no directory \"nowhere\" [200]\n");
    EXPECT_EQ(at.run({"cp", "hosts", "copy-1"}).code, 2);
    EXPECT_EQ(at.run({"cp", "hosts"}).code, 2);
    at.write("hosts", at.read("hosts").substr(0, 200));
    const result damaged = at.run({"cp", "hosts", "copy"});
    EXPECT_EQ(damaged.code, 4);
    EXPECT_EQ(damaged.err, "ktrg: hosts: the file is damaged, or not a table: it has no commit record [215]\n")
        << damaged.err;
    EXPECT_FALSE(at.exists("copy"));
}

TEST(copying, a_counter_is_demanded_of_the_source)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"cp", "hosts@1", "copy"}), 6,
                  "ktrg: hosts: the change counter is 2, not 1: the table has changed\n");
    EXPECT_EQ(at.run({"cp", "hosts", "copy@2"}).code, 2);
    EXPECT_EQ(at.run({"cp", "hosts@2", "copy"}).code, 0);
}

TEST(copying, reads_a_table_that_is_held_and_waits_for_a_target_that_is)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    const holder source(at.file("hosts"));
    EXPECT_EQ(at.run({"cp", "hosts", "copy"}).code, 0);
    const holder target(at.file("other"));
    expect_result(at.run({"cp", "hosts", "other", "-f"}), 5,
                  "ktrg: other: another process holds the table; --wait SECONDS waits for it\n");
    expect_result(at.run({"cp", "hosts", "other", "-f", "--wait", "0.1"}), 5,
                  "ktrg: other: another process still holds the table\n");
    EXPECT_EQ(rows_of(at, "other"), other_rows);
}

TEST(copying, waits_for_another_copy_into_the_directory)
{
    scratch at;
    make_hosts(at);
    at.write(",Lock", "");
    const holder other(at.file(",Lock"));
    EXPECT_EQ(at.run({"cp", "hosts", "copy"}).code, 5);
    EXPECT_FALSE(at.exists("copy"));
}

TEST(copying, that_is_interrupted_while_it_waits_ends_with_130)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    const holder           target(at.file("other"));
    const scratch::running copy = at.start({"cp", "hosts", "other", "-f", "--wait", "30"});
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    kill(copy.pid, SIGINT);
    expect_result(at.finish(copy), 130, "ktrg: interrupted; nothing was changed\n");
    EXPECT_EQ(rows_of(at, "other"), other_rows);
}

TEST(copying, to_a_directory_that_may_not_be_written_is_8)
{
    scratch at;
    make_hosts(at);
    at.write("locked/x", "");
    ASSERT_EQ(chmod(at.file("locked").c_str(), 0555), 0);
    expect_result(at.run({"cp", "hosts", "locked/copy"}), 8,
                  "ktrg: locked/copy: no permission to write in \"locked\" [206]\n");
    ASSERT_EQ(chmod(at.file("locked").c_str(), 0755), 0);
}

TEST(copying, a_source_that_may_not_be_read_is_8)
{
    scratch at;
    make_hosts(at);
    ASSERT_EQ(chmod(at.file("hosts").c_str(), 0), 0);
    expect_result(at.run({"cp", "hosts", "copy"}), 8, "ktrg: hosts: permission denied [206]\n");
    EXPECT_FALSE(at.exists("copy"));
}

TEST(copying, without_room_on_the_disk_is_7_and_leaves_source_and_target_as_they_were)
{
    scratch     at;
    std::string text = "id,n\n";
    for (int i = 0; i < 200; i++)
        text += std::to_string(i) + ",1\n";
    ASSERT_EQ(at.run({"import", "big", "-", "--create"}, text).code, 0);
    make_other(at);
    const std::string limited = std::string("trap '' XFSZ; ulimit -f 2; exec ") + KTRG_PROGRAM + " ";
    const result      fresh   = at.run_program("/bin/sh", {"-c", limited + "cp big copy"});
    EXPECT_EQ(fresh.code, 7);
    EXPECT_NE(fresh.err.find("[10]"), std::string::npos) << fresh.err;
    EXPECT_FALSE(at.exists("copy"));
    EXPECT_FALSE(at.exists("copy.rewrite"));
    EXPECT_EQ(at.run_program("/bin/sh", {"-c", limited + "cp big other --force"}).code, 7);
    EXPECT_EQ(rows_of(at, "other"), other_rows);
    EXPECT_EQ(at.run({"select", "big", "--count"}).out, "200\n");
}

// ---- mv ----

TEST(moving, renames_the_file_and_nothing_else)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    expect_result(at.run({"mv", "hosts", "machines"}), 0, "ktrg: hosts: moved to machines\n");
    EXPECT_EQ(at.read("machines"), before);
    EXPECT_FALSE(at.exists("hosts"));
    at.write("archive/x", "");
    expect_result(at.run({"mv", "machines", "archive/"}), 0, "ktrg: machines: moved to archive/machines\n");
    EXPECT_EQ(at.read("archive/machines"), before);
}

TEST(moving, to_another_file_system_copies_and_removes)
{
    scratch at;
    make_hosts(at);
    struct stat here {
    };
    struct stat there {
    };
    std::string pattern = "/dev/shm/ktrg_test_XXXXXX";
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    ASSERT_EQ(stat(at.file(".").c_str(), &here), 0);
    ASSERT_EQ(stat(pattern.c_str(), &there), 0);
    ASSERT_NE(here.st_dev, there.st_dev) << "the test needs two file systems";
    const std::string target = pattern + "/hosts";
    expect_result(at.run({"mv", "hosts", target}), 0, "ktrg: hosts: moved to " + target + "\n");
    EXPECT_FALSE(at.exists("hosts"));
    EXPECT_EQ(rows_of(at, target), hosts_rows);
    EXPECT_EQ(counter_of(at, target), "2");
    ASSERT_EQ(at.run({"mv", target, "."}).code, 0);
    EXPECT_EQ(rows_of(at, "hosts"), hosts_rows);
    EXPECT_NE(access(target.c_str(), F_OK), 0);
    unlink((pattern + "/,Lock").c_str());
    EXPECT_EQ(rmdir(pattern.c_str()), 0);
}

TEST(moving, over_a_table_needs_force_and_onto_itself_is_refused)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    expect_result(at.run({"mv", "hosts", "other"}), 6, "ktrg: other: the table exists; --force replaces it [201]\n");
    EXPECT_EQ(rows_of(at, "other"), other_rows);
    expect_result(at.run({"mv", "hosts", "./hosts", "-f"}), 2, "ktrg: hosts: source and target are the same file\n");
    expect_result(at.run({"mv", "hosts", "other", "-f", "-n"}), 0, "ktrg: hosts: would be moved over other\n");
    EXPECT_EQ(rows_of(at, "hosts"), hosts_rows);
    expect_result(at.run({"mv", "hosts", "other", "-f"}), 0, "ktrg: hosts: moved over other\n");
    EXPECT_EQ(rows_of(at, "other"), hosts_rows);
    EXPECT_FALSE(at.exists("hosts"));
}

TEST(moving, a_table_that_another_process_writes_is_busy)
{
    scratch at;
    make_hosts(at);
    const holder other(at.file("hosts"));
    expect_result(at.run({"mv", "hosts", "machines"}), 5,
                  "ktrg: hosts: another process holds the table; --wait SECONDS waits for it\n");
    EXPECT_TRUE(at.exists("hosts"));
    EXPECT_FALSE(at.exists("machines"));
}

TEST(moving, what_is_not_there_or_damaged_stays_where_it_is)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"mv", "hots", "machines"}).code, 3);
    EXPECT_EQ(at.run({"mv", "hosts@7", "machines"}).code, 6);
    at.write("hosts", at.read("hosts").substr(0, 200));
    EXPECT_EQ(at.run({"mv", "hosts", "machines"}).code, 4);
    EXPECT_TRUE(at.exists("hosts"));
    EXPECT_FALSE(at.exists("machines"));
}

TEST(moving, out_of_or_into_a_directory_that_may_not_be_written_is_8)
{
    scratch at;
    make_hosts(at, "a/hosts");
    at.write("b/x", "");
    ASSERT_EQ(chmod(at.file("a").c_str(), 0555), 0);
    expect_result(at.run({"mv", "a/hosts", "b/"}), 8, "ktrg: a/hosts: no permission to write in \"a\" [206]\n");
    ASSERT_EQ(chmod(at.file("a").c_str(), 0755), 0);
    ASSERT_EQ(chmod(at.file("b").c_str(), 0555), 0);
    expect_result(at.run({"mv", "a/hosts", "b/"}), 8, "ktrg: b/hosts: no permission to write in \"b\" [206]\n");
    ASSERT_EQ(chmod(at.file("b").c_str(), 0755), 0);
    EXPECT_EQ(rows_of(at, "a/hosts"), hosts_rows);
}

// ---- drop ----

TEST(dropping, needs_force_and_removes_the_file)
{
    scratch at;
    make_hosts(at);
    expect_result(at.run({"drop", "hosts"}), 2,
                  "ktrg: hosts: drop removes the table with all its rows; --force says that this is meant\n");
    expect_result(at.run({"drop", "hosts", "-f", "-n"}), 0, "ktrg: hosts: would be dropped (2 rows)\n");
    EXPECT_TRUE(at.exists("hosts"));
    at.write("hosts.rewrite", "left over");
    expect_result(at.run({"drop", "hosts", "-f"}), 0, "ktrg: hosts: dropped (2 rows)\n");
    EXPECT_FALSE(at.exists("hosts"));
    EXPECT_FALSE(at.exists("hosts.rewrite"));
    EXPECT_EQ(at.run({"drop", "hosts", "-f"}).code, 3);
}

TEST(dropping, several_tables_goes_through_for_all_or_none)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    expect_result(at.run({"drop", "hosts", "othr", "-f"}), 3,
                  "ktrg: othr: no such table (did you mean \"other\"?) [200]\n");
    expect_result(at.run({"drop", "hosts", "./hosts", "-f"}), 2, "ktrg: ./hosts: named twice\n");
    {
        const holder held(at.file("other"));
        EXPECT_EQ(at.run({"drop", "hosts", "other", "-f"}).code, 5);
    }
    EXPECT_TRUE(at.exists("hosts"));
    expect_result(at.run({"drop", "hosts", "other", "-f"}), 0,
                  "ktrg: hosts: dropped (2 rows)\nktrg: other: dropped (1 row)\n");
    EXPECT_FALSE(at.exists("other"));
}

TEST(dropping, that_fails_half_way_ends_with_10_and_says_where)
{
    scratch at;
    make_hosts(at);
    make_other(at);
    // The counter is only looked at when the table's turn comes.
    expect_result(at.run({"drop", "hosts", "other@9", "-f"}), 10,
                  "ktrg: hosts: dropped (2 rows)\n"
                  "ktrg: other: the change counter is 2, not 9: the table has changed\n");
    EXPECT_TRUE(at.exists("other"));
}

TEST(dropping, takes_a_damaged_table_but_not_what_is_none)
{
    scratch at;
    make_hosts(at);
    at.write("hosts", at.read("hosts").substr(0, 200));
    at.write("notes", "what I wanted to remember, and no table");
    expect_result(at.run({"drop", "notes", "-f"}), 4,
                  "ktrg: notes: not a table, or damaged at its head: drop leaves it alone, and rm removes it [14]\n");
    EXPECT_TRUE(at.exists("notes"));
    EXPECT_EQ(at.run({"drop", "hosts@2", "-f"}).code, 4);
    expect_result(at.run({"drop", "hosts", "-f", "-n"}), 0, "ktrg: hosts: would be dropped (it is damaged)\n");
    EXPECT_TRUE(at.exists("hosts"));
    expect_result(at.run({"drop", "hosts", "-f"}), 0, "ktrg: hosts: dropped (it is damaged)\n");
    EXPECT_FALSE(at.exists("hosts"));
}

TEST(dropping, without_permission_is_8)
{
    scratch at;
    make_hosts(at, "a/hosts");
    ASSERT_EQ(chmod(at.file("a").c_str(), 0555), 0);
    EXPECT_EQ(at.run({"drop", "a/hosts", "-f"}).code, 8);
    ASSERT_EQ(chmod(at.file("a").c_str(), 0755), 0);
    EXPECT_TRUE(at.exists("a/hosts"));
}

// ---- repair ----

TEST(repairing, removes_the_rewrite_file_of_a_table_and_leaves_the_table)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    at.write("hosts.rewrite", "left over");
    expect_result(at.run({"repair", "hosts", "-n"}), 0,
                  "ktrg: hosts: a leftover rewrite file of 9 bytes would be removed\n");
    EXPECT_TRUE(at.exists("hosts.rewrite"));
    expect_result(at.run({"repair", "hosts"}), 0, "ktrg: hosts: a leftover rewrite file of 9 bytes was removed\n");
    EXPECT_FALSE(at.exists("hosts.rewrite"));
    EXPECT_EQ(at.read("hosts"), before);
    expect_result(at.run({"repair", "hosts"}), 0, "ktrg: nothing to repair\n");
    expect_result(at.run({"repair", "hosts", "-q"}), 0, "");
}

TEST(repairing, a_directory_takes_all_that_is_left_in_it_also_of_tables_that_were_never_made)
{
    scratch at;
    make_hosts(at, "state/hosts");
    at.write("state/hosts.rewrite", "x");
    at.write("state/net,never.rewrite", "xy");
    at.write("state/not-a-table.rewrite", "mine");
    at.write("state/.rewrite", "mine");
    expect_result(at.run({"repair", "state"}), 0,
                  "ktrg: state/hosts: a leftover rewrite file of 1 byte was removed\n"
                  "ktrg: state/net,never: a leftover rewrite file of 2 bytes was removed\n");
    EXPECT_TRUE(at.exists("state/not-a-table.rewrite"));
    EXPECT_TRUE(at.exists("state/.rewrite"));
    EXPECT_TRUE(at.exists("state/hosts"));
}

TEST(repairing, touches_nothing_that_another_process_holds)
{
    for (const std::string held : {"hosts", "hosts.rewrite", ",Lock"}) {
        scratch at;
        make_hosts(at);
        at.write("hosts.rewrite", "under way");
        at.write(",Lock", "");
        const holder other(at.file(held));
        expect_result(at.run({"repair", "hosts"}), 5, "ktrg: hosts: another process holds the table\n");
        EXPECT_TRUE(at.exists("hosts.rewrite")) << held;
    }
}

TEST(repairing, goes_on_behind_what_fails_and_says_so)
{
    scratch at;
    make_hosts(at);
    at.write("hosts.rewrite", "x");
    expect_result(at.run({"repair", "nothing", "hosts"}), 10,
                  "ktrg: nothing: no such table [200]\n"
                  "ktrg: hosts: a leftover rewrite file of 1 byte was removed\n");
    expect_result(at.run({"repair", "nothing", "hosts"}), 3, "ktrg: nothing: no such table [200]\n");
}

TEST(repairing, without_permission_is_8)
{
    scratch at;
    make_hosts(at, "a/hosts");
    at.write("a/hosts.rewrite", "x");
    ASSERT_EQ(chmod(at.file("a").c_str(), 0555), 0);
    const result end = at.run({"repair", "a/hosts"});
    EXPECT_EQ(end.code, 8);
    EXPECT_EQ(end.err, "ktrg: a/hosts: a/hosts.rewrite can't be removed: is the directory writable? [206]\n");
    ASSERT_EQ(chmod(at.file("a").c_str(), 0755), 0);
}

// ---- -v ----

TEST(verbose, tells_what_is_opened_and_written_with_rows_bytes_counter_and_time)
{
    scratch at;
    make_hosts(at);
    const std::string bytes = std::to_string(at.read("hosts").size());
    const result      copy  = at.run({"cp", "hosts", "copy", "-v"});
    EXPECT_EQ(copy.out, "");
    EXPECT_TRUE(std::regex_match(copy.err, std::regex("ktrg: hosts: open for reading: 2 rows, 3 columns, " + bytes +
                                                      " bytes, counter 2, [0-9.]+ ms\n"
                                                      "ktrg: copy: written: [0-9]+ bytes, [0-9.]+ ms\n"
                                                      "ktrg: hosts: copied to copy \\(2 rows\\)\n"
                                                      "ktrg: [0-9.]+ ms in all\n")))
        << copy.err;
    const result put = at.run({"put", "hosts", "name=gamma", "-v", "-q"});
    EXPECT_TRUE(std::regex_match(
        put.err, std::regex("ktrg: hosts: open for writing: 2 rows, 3 columns, " + bytes +
                            " bytes, counter 2, [0-9.]+ ms\n"
                            "ktrg: hosts: committed: 3 rows, 3 columns, [0-9]+ bytes, counter 3, [0-9.]+ ms\n"
                            "ktrg: [0-9.]+ ms in all\n")))
        << put.err;
    EXPECT_EQ(at.run({"select", "hosts", "-v", "--count"}).out, "3\n");
    const result made = at.run({"create", "t", "id:int32:key", "-v", "-q"});
    EXPECT_TRUE(
        std::regex_match(made.err, std::regex("ktrg: t: created: 0 rows, 1 column, [0-9]+ bytes, counter [0-9]+, "
                                              "[0-9.]+ ms\nktrg: [0-9.]+ ms in all\n")))
        << made.err;
    const result stat = at.run({"stat", "t", "-v"});
    EXPECT_TRUE(std::regex_search(
        stat.err, std::regex("^ktrg: t: read record by record: 0 rows, 1 column, [0-9]+ bytes, counter [0-9]+, ")))
        << stat.err;
}

} // namespace
