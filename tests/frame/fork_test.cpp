// SPDX-License-Identifier: MIT
// What a forked child may do with what it inherited: read, open and close; not update.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <string>

#include "exported_calls.h"
#include "rg_i_tree.h"
#include "support/registry.h"
#include "support/rows.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

// Runs the checks in a forked child; what they say is the child's exit status. A check that fails tells where.
class child_checks
{
  public:
    void check(bool holds, int line)
    {
        if (!holds && first_failure_ == 0)
            first_failure_ = line;
    }
    int first_failure() const { return first_failure_; }

  private:
    int first_failure_ = 0;
};

#define IN_CHILD(checks, condition) (checks).check((condition), __LINE__)

// The line of the first check that failed in the child; 0: none; -1: the child ended in another way.
int run_in_child(const std::function<void(child_checks &)> & body)
{
    int ends[2];
    if (pipe(ends) != 0)
        return -1;
    const pid_t child = fork();
    if (child == 0) {
        child_checks checks;
        body(checks);
        const int line = checks.first_failure();
        _exit(write(ends[1], &line, sizeof line) == sizeof line ? 0 : 1);
    }
    close(ends[1]);
    int        line    = -1;
    const bool told    = read(ends[0], &line, sizeof line) == sizeof line;
    int        status  = 0;
    const bool awaited = waitpid(child, &status, 0) == child;
    close(ends[0]);
    return told && awaited && WIFEXITED(status) && WEXITSTATUS(status) == 0 ? line : -1;
}

class in_a_child : public ::testing::Test, public registry_of_tables
{
  public:
    in_a_child()
        : table(make({false, true}, {column("K", KT_UINT32, RG_PRIMARY_KEY), column("V", KT_UINT32)}, explicit_writing))
    {
        EXPECT_EQ(add(1), 0);
        EXPECT_EQ(commit(table), 0);
        EXPECT_EQ(add(2), 0); // pending
    }
    kt_int32_t add(kt_uint32_t key) { return add_row(table, {{"K", uint32(key)}, {"V", uint32(key * 10)}}); }

    rg_opaque_handle_t table;
};

} // namespace

TEST_F(in_a_child, an_update_returns_15_and_leaves_the_error_record_untouched)
{
    EXPECT_EQ(rg_close_tree_1(nullptr), 100); // a record that stands
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  IN_CHILD(checks, add(3) == 15);
                  IN_CHILD(checks, error_code() == 100);
                  IN_CHILD(checks, error_message_index() == 7);
                  ku_set_no_error_1();
                  IN_CHILD(checks, add(3) == 15);
                  IN_CHILD(checks, error_code() == 0);
              }),
              0);
}

TEST_F(in_a_child, each_update_returns_15_ahead_of_the_test_of_its_handle_and_no_other_call_does)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  for (const exported_call & c : all_calls())
                      IN_CHILD(checks, c.call(nullptr) == (c.is_update ? 15 : 100));
              }),
              0);
}

TEST_F(in_a_child, each_update_returns_15_ahead_of_the_test_of_its_arguments)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  IN_CHILD(checks, rg_add_row_1(table, nullptr, nullptr, 1) == 15);
                  IN_CHILD(checks, rg_set_field_by_index_1(table, 0, nullptr, nullptr) == 15);
                  IN_CHILD(checks, rg_set_fields_by_index_1(table, 0, nullptr, nullptr, 1) == 15);
                  IN_CHILD(checks, rg_set_application_metadata_1(table, nullptr) == 15);
                  IN_CHILD(checks, rg_create_table_1(tree, nullptr, nullptr, 0, 99, nullptr) == 15);
                  IN_CHILD(checks, rg_create_hashed_key_table_1(tree, nullptr, nullptr, 0, 99, 0, nullptr, nullptr,
                                                                nullptr) == 15);
                  IN_CHILD(checks, rg_mount_local_tree_1(tree, nullptr, nullptr, 1) == 15);
              }),
              0);
}

TEST_F(in_a_child, a_refused_update_makes_no_event_and_takes_no_lock)
{
    trace_catcher trace(1, 1);
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  pthread_mutex_lock(&ForkMutex); // as another thread may have held it at the fork
                  trace.clear();
                  IN_CHILD(checks, add(3) == 15);
                  IN_CHILD(checks, rg_abort_1(nullptr) == 15);
                  IN_CHILD(checks, trace.events().empty());
              }),
              0);
}

TEST_F(in_a_child, reads_see_what_was_inherited)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  const reading committed = read_key(table, uint32(1), "V");
                  IN_CHILD(checks, committed.rc == 0 && committed.value.val_uint32 == 10);
                  const reading pending = read_key(table, uint32(2), "V", 1);
                  IN_CHILD(checks, pending.rc == 0 && pending.value.val_uint32 == 20);
                  IN_CHILD(checks, read_packed(table, 0, "V").rc == 0);
                  IN_CHILD(checks, find_key(table, uint32(1)) == 0);
                  IN_CHILD(checks, read_key(table, uint32(9), "V").rc == 202);
                  IN_CHILD(checks, error_code() == 202);
              }),
              0);
}

TEST_F(in_a_child, opening_and_closing_still_run)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  rg_opaque_handle_t second = nullptr;
                  IN_CHILD(checks, rg_open_table_1(tree, text("/kept/table"), RG_MODE_READ, &second) == 0);
                  IN_CHILD(checks, second == table);
                  IN_CHILD(checks, rg_close_table_1(second) == 0);

                  // A tree of its own, and the file through it.
                  rg_opaque_handle_t own_tree = nullptr;
                  IN_CHILD(checks, rg_open_tree_1(&own_tree, 0, 0) == 0);
                  IN_CHILD(checks, rg_mount_local_tree_1(own_tree, text("/m"), text(directory.path()), 1) == 15);
                  IN_CHILD(checks, rg_close_tree_1(own_tree) == 0);

                  IN_CHILD(checks, rg_unmount_local_tree_1(tree, text("/kept")) == 0);
              }),
              0);
    rg_opaque_handle_t second = nullptr; // the parent's mount point is its own
    EXPECT_EQ(rg_open_table_1(tree, text("/kept/table"), RG_MODE_READ, &second), 0);
}

TEST_F(in_a_child, a_file_can_be_opened_for_reading_anew)
{
    EXPECT_EQ(commit(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  rg_opaque_handle_t own = nullptr;
                  IN_CHILD(checks, rg_open_table_1(tree, text("/kept/table"), RG_MODE_READ, &own) == 0);
                  const reading r = read_key(own, uint32(2), "V");
                  IN_CHILD(checks, r.rc == 0 && r.value.val_uint32 == 20);
                  IN_CHILD(checks, rg_close_table_1(own) == 0);
              }),
              0);
}

TEST_F(in_a_child, a_tree_can_be_closed_and_the_parent_keeps_its_own)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) { IN_CHILD(checks, rg_close_tree_1(tree) == 0); }), 0);
    EXPECT_EQ(read_key(table, uint32(1), "V").rc, 0);
    EXPECT_EQ(commit(table), 0);
}

TEST_F(in_a_child, the_parent_stays_a_parent_and_a_grandchild_is_a_child)
{
    EXPECT_EQ(run_in_child([&](child_checks & checks) {
                  IN_CHILD(checks, In_Child_Process == 1);
                  IN_CHILD(checks, run_in_child([&](child_checks & inner) {
                                       IN_CHILD(inner, In_Child_Process == 1);
                                       IN_CHILD(inner, add(3) == 15);
                                   }) == 0);
              }),
              0);
    EXPECT_EQ(In_Child_Process, 0u);
    EXPECT_EQ(add(3), 0);
}

TEST(a_process_that_never_opened_a_tree, has_children_that_may_update)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // in a process of its own
    EXPECT_EXIT(
        {
            const int failed = run_in_child([](child_checks & checks) {
                IN_CHILD(checks, In_Child_Process == 0);
                registry_of_tables       registry;
                const rg_opaque_handle_t table =
                    registry.make({false, true}, {column("K", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE);
                IN_CHILD(checks, add_row(table, {{"K", uint32(1)}}) == 0);
                IN_CHILD(checks, In_Child_Process == 0);
            });
            _exit(failed == 0 ? 0 : 1);
        },
        testing::ExitedWithCode(0), "");
}
