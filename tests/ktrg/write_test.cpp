// SPDX-License-Identifier: MIT
// create, put and rm: each is one transaction, refuses what it can't do, and has a dry run.
#include "program.h"

using ktrg_test::result;
using ktrg_test::scratch;

namespace
{

std::string rows_of(const scratch & at)
{
    return at.run({"select", "hosts", "--sort", "name", "-H", "-o", "tsv"}).out;
}

void make_hosts(const scratch & at)
{
    const result made = at.run({"import", "hosts", "-", "--create"}, "name,load,cpus\nalpha,0.25,4\nbeta,1.5,16\n");
    ASSERT_EQ(made.code, 0) << made.err;
}

// ---- create ----

TEST(creating, makes_the_columns_that_schema_shows_again)
{
    scratch                        at;
    const std::vector<std::string> columns = {"id:uint32:key", "name:string=nobody", "load:float64:protected=0.5",
                                              "tags:string[]", "at:struct(x:int32,y:int32)"};
    std::vector<std::string>       words   = {"create", "t"};
    words.insert(words.end(), columns.begin(), columns.end());
    const result made = at.run(words);
    ASSERT_EQ(made.code, 0) << made.err;
    std::string expected;
    for (const std::string & column : columns)
        expected += column + "\n";
    EXPECT_EQ(at.run({"schema", "t"}).out, expected);
    EXPECT_EQ(at.run({"select", "t", "--count"}).out, "0\n");
    ASSERT_EQ(at.run({"put", "t", "id=7"}).code, 0);
    EXPECT_EQ(at.run({"get", "t", "7", "-o", "jsonl"}).out,
              "{\"id\":7,\"name\":\"nobody\",\"load\":0.5,\"tags\":[],\"at\":{}}\n");
}

TEST(creating, puts_the_key_in_front)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "a:int32", "b:int32", "id:int32:key"}).code, 0);
    EXPECT_EQ(at.run({"schema", "t"}).out, "id:int32:key\na:int32\nb:int32\n");
}

TEST(creating, refuses_what_the_registry_would_and_leaves_no_file)
{
    scratch at;
    EXPECT_EQ(at.run({"create", "t", "a:int32"}).err, "ktrg: t: no column is marked as the key [107]\n");
    EXPECT_EQ(at.run({"create", "t", "a:int32:key", "b:int32:key"}).err,
              "ktrg: t: two columns are marked as the key [108]\n");
    EXPECT_EQ(at.run({"create", "t", "a:int32:key", "a:int32"}).err,
              "ktrg: t: two columns have the name \"a\" [106]\n");
    EXPECT_EQ(at.run({"create", "t", "a:int32:key", "b:int32=x"}).err,
              "ktrg: t: the default of \"b\": \"x\" is not an int32 [105]\n");
    for (const std::vector<std::string> & words : {std::vector<std::string>{"create", "t", "a"},
                                                   {"create", "t", "a:binary:key"},
                                                   {"create", "t", "1a:int32:key"},
                                                   {"create", "t"}})
        EXPECT_EQ(at.run(words).code, 2);
    EXPECT_FALSE(at.exists("t"));
    EXPECT_FALSE(at.exists("t.rewrite"));
}

TEST(creating, refuses_a_table_that_exists_and_a_dry_run_makes_none)
{
    scratch at;
    EXPECT_EQ(at.run({"create", "t", "a:int32:key", "-n"}).code, 0);
    EXPECT_FALSE(at.exists("t"));
    EXPECT_EQ(at.run({"create", "t", "a:int32:key"}).err, "ktrg: t: created with 1 column\n");
    EXPECT_EQ(at.run({"create", "t", "a:int32:key"}).code, 6);
}

// ---- put ----

TEST(putting, adds_a_row_and_then_updates_it_keeping_what_is_not_named)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"put", "hosts", "name=gamma", "cpus=2"}).err, "ktrg: hosts: the row \"gamma\" was added\n");
    EXPECT_EQ(at.run({"put", "hosts", "load=-1.5", "name=gamma"}).err, "ktrg: hosts: the row \"gamma\" was updated\n");
    EXPECT_EQ(rows_of(at), "alpha\t0.25\t4\nbeta\t1.5\t16\ngamma\t-1.5\t2\n");
}

TEST(putting, a_value_may_hold_an_equals_sign_and_be_empty)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "note:string=x"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=-1", "note=a=b"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=2", "note="}).code, 0);
    EXPECT_EQ(at.run({"select", "t", "-H", "-o", "csv"}).out, "-1,a=b\r\n2,\"\"\r\n");
}

TEST(putting, insert_and_update_insist)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    const result      insert = at.run({"put", "hosts", "name=alpha", "cpus=1", "--insert"});
    EXPECT_EQ(insert.code, 6);
    EXPECT_EQ(insert.err, "ktrg: hosts: a row with the key \"alpha\" exists [108]\n");
    const result update = at.run({"put", "hosts", "name=gamma", "cpus=1", "--update"});
    EXPECT_EQ(update.code, 1);
    EXPECT_EQ(update.err, "ktrg: hosts: no row with the key \"gamma\" [202]\n");
    EXPECT_EQ(at.run({"put", "hosts", "name=gamma", "--insert", "--update"}).code, 2);
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(putting, mistakes_change_nothing)
{
    scratch at;
    make_hosts(at);
    const std::string before = at.read("hosts");
    EXPECT_EQ(at.run({"put", "hosts", "cpus=1"}).err, "ktrg: hosts: the key is missing: \"name=...\" [107]\n");
    EXPECT_EQ(at.run({"put", "hosts", "nam=x"}).err, "ktrg: hosts: no column \"nam\" (did you mean \"name\"?) [105]\n");
    EXPECT_EQ(at.run({"put", "hosts", "name=x", "cpus=many"}).err,
              "ktrg: hosts: column \"cpus\": \"many\" is not an int64\n");
    EXPECT_EQ(at.run({"put", "hosts", "name=x", "name=y"}).code, 2);
    EXPECT_EQ(at.run({"put", "hosts", "name"}).code, 2);
    EXPECT_EQ(at.run({"put", "hots", "name=x"}).code, 3);
    EXPECT_EQ(at.run({"put", "hosts", "name=alpha", "cpus=9", "--dry-run"}).err,
              "ktrg: hosts: the row \"alpha\" would be updated\n");
    EXPECT_EQ(at.read("hosts"), before);
}

TEST(putting, protected_columns_are_set_once)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "born:int32:protected"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1", "born=1999"}).code, 0);
    const result again = at.run({"put", "t", "id=1", "born=2000"});
    EXPECT_EQ(again.code, 8);
    EXPECT_EQ(again.err, "ktrg: t: column \"born\" is protected: it can't be updated [105]\n");
    EXPECT_EQ(at.run({"select", "t", "-H", "-o", "csv"}).out, "1,1999\r\n");
}

TEST(putting, columns_flagged_reset_take_their_default_again)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:key", "state:string:reset=idle", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1", "state=busy", "n=1"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1", "n=2"}).code, 0);
    EXPECT_EQ(at.run({"select", "t", "-H", "-o", "csv"}).out, "1,idle,2\r\n");
}

TEST(putting, into_a_table_whose_keys_may_repeat_updates_one_of_them)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:multikey", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"import", "t", "-"}, "id,n\n1,10\n1,20\n").code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1", "n=30"}).code, 0);
    EXPECT_EQ(at.run({"select", "t", "--count"}).out, "2\n");
}

// ---- rm ----

TEST(removing, rows_go_by_their_keys)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"rm", "hosts", "alpha"}).err, "ktrg: hosts: 1 row was deleted\n");
    EXPECT_EQ(rows_of(at), "beta\t1.5\t16\n");
    const result none = at.run({"rm", "hosts", "alpha"});
    EXPECT_EQ(none.code, 1);
    EXPECT_EQ(none.err, "ktrg: hosts: no row with the key \"alpha\" [202]\nktrg: hosts: 0 rows were deleted\n");
}

TEST(removing, a_row_can_be_added_again_and_a_key_of_several_rows_takes_them_all)
{
    scratch at;
    ASSERT_EQ(at.run({"create", "t", "id:int32:multikey", "n:int32"}).code, 0);
    ASSERT_EQ(at.run({"import", "t", "-"}, "id,n\n1,10\n-2,20\n1,30\n").code, 0);
    ASSERT_EQ(at.run({"rm", "t", "1"}).code, 0);
    EXPECT_EQ(at.run({"select", "t", "-H", "-o", "csv"}).out, "-2,20\r\n");
    ASSERT_EQ(at.run({"rm", "t", "-2"}).code, 0);
    ASSERT_EQ(at.run({"put", "t", "id=1"}).code, 0);
    EXPECT_EQ(at.run({"select", "t", "-H", "-o", "csv"}).out, "1,0\r\n");
}

TEST(removing, all_needs_force)
{
    scratch at;
    make_hosts(at);
    EXPECT_EQ(at.run({"rm", "hosts", "--all"}).code, 2);
    EXPECT_EQ(at.run({"rm", "hosts"}).code, 2);
    EXPECT_EQ(at.run({"rm", "hosts", "--all", "--force", "-n"}).err, "ktrg: hosts: 2 rows would be deleted\n");
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "2\n");
    EXPECT_EQ(at.run({"rm", "hosts", "--all", "--force"}).code, 0);
    EXPECT_EQ(at.run({"select", "hosts", "--count"}).out, "0\n");
    EXPECT_EQ(at.run({"rm", "hosts", "--all", "--force"}).code, 1);
}

TEST(removing, a_key_that_is_none_is_a_usage_error_and_nothing_goes)
{
    scratch at;
    ASSERT_EQ(at.run({"import", "t", "-", "--create"}, "id,n\n1,2\n").code, 0);
    const std::string before = at.read("t");
    EXPECT_EQ(at.run({"rm", "t", "1", "one"}).code, 2);
    EXPECT_EQ(at.read("t"), before);
}

} // namespace
