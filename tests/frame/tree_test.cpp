// SPDX-License-Identifier: MIT
// Opening and closing trees.
#include <gtest/gtest.h>
#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <iterator>
#include <string>
#include <thread>
#include <vector>

#include "frame/rg_i_trace.h"
#include "rg_i_tree.h"
#include "support/faults.h"
#include "support/registry.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

rg_i_tree_t & inside(rg_opaque_handle_t tree)
{
    return *static_cast<rg_i_tree_t *>(tree);
}

bool is_known(rg_opaque_handle_t tree)
{
    return tfind(tree, &P_Registry_Trees, rg_i_pointer_compare) != nullptr;
}

size_t open_descriptors()
{
    const std::filesystem::directory_iterator all("/proc/self/fd");
    return static_cast<size_t>(std::distance(begin(all), end(all)));
}

bool is_free(pthread_mutex_t & mutex)
{
    const bool taken = pthread_mutex_trylock(&mutex) == 0;
    if (taken)
        pthread_mutex_unlock(&mutex);
    return taken;
}

} // namespace

// ---- Opening ----

TEST(opening_a_tree, makes_one_without_tables_and_mount_points_and_with_both_conversion_handles)
{
    rg_opaque_handle_t tree = nullptr;
    ASSERT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(inside(tree).p_tables, nullptr);
    EXPECT_EQ(inside(tree).p_unnamed_tables, nullptr);
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
    EXPECT_NE(inside(tree).p_to_table_string_conversion_handle, nullptr);
    EXPECT_NE(inside(tree).p_from_table_string_conversion_handle, nullptr);
    EXPECT_EQ(inside(tree).lock.lock_count, 0);
    EXPECT_TRUE(is_known(tree));
    EXPECT_EQ(rg_close_tree_1(tree), 0);
}

TEST(opening_a_tree, with_null_returns_100_and_readies_the_process_all_the_same)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // in a process of its own, which has opened no tree yet
    EXPECT_EXIT(
        {
            const bool new_process = Rg_Library_Registered_For_Trace == 0 && calls_made(call::atfork) == 0;
            const bool refused     = rg_open_tree_1(nullptr, 0, 0) == 100 && error_code() == 100;
            const bool registered  = Rg_Library_Registered_For_Trace == 1 &&
                                    tr_set_level_1("_RGA", "Wherever", 3) == 0 && Rg_Trace_Level_Of_Detail[2] == 3;
            const bool handled = calls_made(call::atfork) == 1;
            _exit(new_process && refused && registered && handled ? 0 : 1);
        },
        testing::ExitedWithCode(0), "");
}

TEST(opening_a_tree, registers_the_fork_handler_once)
{
    const open_tree   first;
    const fault_scope faults;
    const open_tree   second;
    EXPECT_EQ(calls_made(call::atfork), 0u);
}

TEST(opening_a_tree, number_of_retries_and_timeout_have_no_effect)
{
    const fault_scope faults;
    for (const kt_uint64_t number : {kt_uint64_t{0}, kt_uint64_t{1}, kt_uint64_t{UINT32_MAX}, UINT64_MAX}) {
        rg_opaque_handle_t tree = nullptr;
        EXPECT_EQ(rg_open_tree_1(&tree, static_cast<kt_uint32_t>(number), number), 0);
        EXPECT_EQ(rg_close_tree_1(tree), 0);
    }
    EXPECT_EQ(calls_made(call::usleep), 0u);
}

TEST(opening_a_tree, any_number_may_be_open_and_they_are_independent)
{
    const temp_dir dir;
    open_tree      first;
    open_tree      second;
    first.mount("/m", dir.path());
    EXPECT_NE(static_cast<rg_opaque_handle_t>(first), static_cast<rg_opaque_handle_t>(second));
    EXPECT_NE(inside(first).p_mount_points, nullptr);
    EXPECT_EQ(inside(second).p_mount_points, nullptr);
    first.close();
    EXPECT_TRUE(is_known(second));
}

TEST(opening_a_tree, a_failed_allocation_leaves_nothing_behind)
{
    const open_tree other; // so that the process is ready
    unsigned        failures = 0;
    for (;; ++failures) {
        const fault_scope  faults;
        rg_opaque_handle_t untouched = &failures;
        rg_opaque_handle_t tree      = untouched;
        fail_call(call::allocation, failures + 1, ENOMEM);
        const kt_int32_t rc = rg_open_tree_1(&tree, 0, 0);
        if (!failed_as_asked(call::allocation)) {
            ASSERT_EQ(rc, 0);
            EXPECT_EQ(rg_close_tree_1(tree), 0);
            break;
        }
        EXPECT_TRUE(rc == 12 || rc == 11) << rc; // 11 where the utility library has no memory
        EXPECT_EQ(error_code(), rc);
        EXPECT_EQ(tree, untouched);
        EXPECT_TRUE(is_free(Registry_Trees_Mutex));
    }
    EXPECT_GE(failures, 2u); // the tree and its node at least
}

TEST(opening_a_tree, without_memory_for_the_tree_returns_12)
{
    const open_tree   other;
    const fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    rg_opaque_handle_t tree = nullptr;
    EXPECT_EQ(rg_open_tree_1(&tree, 0, 0), 12);
    EXPECT_EQ(error_code(), 12);
    EXPECT_EQ(error_message_index(), 3);
}

TEST(opening_a_tree, a_mutex_that_fails_gives_10_with_its_name_and_nothing_is_returned)
{
    const open_tree   other;
    const fault_scope faults;
    bool              found = false;
    // The mutex of the trees is the last one that is locked before the tear-down.
    for (unsigned nth = 1; !found && nth < 20; ++nth) {
        rg_opaque_handle_t tree = nullptr;
        fail_call(call::mutex_lock, nth, EINVAL);
        const kt_int32_t rc = rg_open_tree_1(&tree, 0, 0);
        if (rc == 0) {
            EXPECT_EQ(rg_close_tree_1(tree), 0);
        }
        found = rc == 10;
        EXPECT_EQ(tree != nullptr, rc == 0);
        if (found) {
            EXPECT_EQ(error_message_index(), 1);
            EXPECT_EQ(error_text().find("2605-010 The pthread_mutex_lock system call unexpectedly returned an errno "
                                        "of 22 to the "),
                      0u);
        }
        reset_calls();
    }
    EXPECT_TRUE(found);
}

TEST(opening_a_tree, ends_the_process_where_the_fork_handler_cannot_be_registered)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // in a process of its own, which has opened no tree yet
    EXPECT_DEATH(
        {
            fail_call(call::atfork, 1, ENOMEM);
            rg_opaque_handle_t tree;
            rg_open_tree_1(&tree, 0, 0);
        },
        "0 == pthread_atfork\\(\\(\\(void \\*\\)0\\), \\(\\(void \\*\\)0\\), ForkChildHandler\\)");
}

TEST(opening_a_tree, the_first_entry_of_a_process_is_not_traced)
{
    std::vector<std::uint32_t> ids;
    tr_set_sink_1([](void *             p_token,
                     const tr_event_t * p_event) { static_cast<decltype(ids) *>(p_token)->push_back(p_event->id); },
                  &ids);
    rg_opaque_handle_t tree = nullptr;
    EXPECT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
    EXPECT_TRUE(ids.empty()); // no level was set before the component was known
    EXPECT_EQ(tr_set_level_1("_RGA", "API", 1), 0);
    EXPECT_EQ(rg_close_tree_1(tree), 0);
    EXPECT_EQ(ids, (std::vector<std::uint32_t>{15, 16}));
    EXPECT_EQ(tr_set_level_1("_RGA", "API", 0), 0);
    tr_set_sink_1(nullptr, nullptr);
}

// ---- Closing ----

TEST(closing_a_tree, null_is_refused)
{
    EXPECT_EQ(rg_close_tree_1(nullptr), 100);
    EXPECT_EQ(error_code(), 100);
    EXPECT_EQ(error_message_index(), 7);
}

TEST(closing_a_tree, frees_its_mount_points)
{
    const temp_dir     dir;
    rg_opaque_handle_t tree = nullptr;
    ASSERT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
    for (int i = 0; i < 20; ++i)
        ASSERT_EQ(rg_mount_local_tree_1(tree, text("/m" + std::to_string(i)), text(dir.path()), 1), 0);
    EXPECT_EQ(rg_close_tree_1(tree), 0); // the sanitizer tells what stays
    EXPECT_EQ(error_code(), 0);
    EXPECT_FALSE(is_known(tree));
}

TEST(closing_a_tree, a_mutex_of_the_trees_that_fails_is_returned_raw_without_a_record_and_nothing_is_closed)
{
    rg_opaque_handle_t tree = nullptr;
    ASSERT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
    {
        const fault_scope faults;
        fail_call(call::mutex_lock, 1, EDEADLK);
        EXPECT_EQ(rg_close_tree_1(tree), EDEADLK);
    }
    EXPECT_EQ(error_code(), 0);
    EXPECT_TRUE(is_known(tree));
    EXPECT_EQ(rg_close_tree_1(tree), 0);
}

TEST(closing_a_tree, a_lock_of_the_tree_that_fails_gives_10_and_the_tree_can_be_closed_again)
{
    rg_opaque_handle_t tree = nullptr;
    ASSERT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
    {
        const fault_scope faults;
        fail_call(call::mutex_lock, 2, EDEADLK);
        EXPECT_EQ(rg_close_tree_1(tree), 10);
        EXPECT_EQ(error_code(), 10);
        EXPECT_EQ(error_message_index(), 1);
    }
    EXPECT_EQ(rg_close_tree_1(tree), 0);
}

TEST(closing_a_tree, with_open_tables_frees_them_all_and_drops_what_is_pending)
{
    const temp_dir dir;
    const auto     columns = [] { return std::vector<rg_column_t>{column("K", KT_UINT32, RG_PRIMARY_KEY)}; };
    const auto     key     = [](kt_uint32_t k) { return named_value{"K", uint32(k)}; };
    open_tree      tree;
    tree.mount("/m", dir.path());
    const kt_int32_t         explicit_writing = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    const rg_opaque_handle_t kept             = create_table(tree, "/m/t", columns(), explicit_writing);
    const rg_opaque_handle_t applied          = create_hashed_table(tree, "/m/applied", columns(), explicit_writing);
    const rg_opaque_handle_t transient        = create_hashed_table(tree, "/t", columns(), explicit_writing);
    EXPECT_EQ(open_table(tree, "/m/t", RG_MODE_READ), kept); // twice open
    EXPECT_EQ(add_row(kept, {key(1)}), 0);
    EXPECT_EQ(rg_apply_1(kept, 0), 0);
    EXPECT_EQ(rg_commit_1(kept), 0);
    EXPECT_EQ(add_row(kept, {key(2)}), 0);
    EXPECT_EQ(add_row(transient, {key(3)}), 0);
    EXPECT_EQ(add_row(applied, {key(4)}), 0);
    EXPECT_EQ(rg_apply_1(applied, 0), 0);
    const size_t descriptors = open_descriptors();
    tree.close();
    EXPECT_EQ(open_descriptors(), descriptors - 2);

    open_tree second;
    second.mount("/m", dir.path());
    kt_value_t               value;
    const rg_opaque_handle_t again = open_table(second, "/m/t", RG_MODE_READ);
    EXPECT_EQ(rg_get_field_by_key_1(again, uint32(1), text("K"), &value), 0);
    EXPECT_EQ(rg_get_field_by_key_1(again, uint32(2), text("K"), &value), 202);
    const rg_opaque_handle_t never_committed = open_table(second, "/m/applied", RG_MODE_READ);
    EXPECT_EQ(rg_get_field_by_key_1(never_committed, uint32(4), text("K"), &value), 202);
}

// ---- The conversion handles ----

TEST(conversion_handles, what_was_opened_before_a_failure_stays_for_the_caller_to_close)
{
    bool both_failed = false;
    bool one_failed  = false;
    for (unsigned nth = 1;; ++nth) {
        const fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        ku_iconv_t *     p_to_table   = nullptr;
        ku_iconv_t *     p_from_table = nullptr;
        const kt_int32_t rc           = rg_i_get_string_conversion_handles(&p_to_table, &p_from_table);
        if (rc != 0) {
            EXPECT_EQ(rc, 11);
            EXPECT_EQ(error_code(), 11);
            EXPECT_EQ(error_message_index(), 2);
            EXPECT_EQ(p_from_table, nullptr);
            (p_to_table == nullptr ? both_failed : one_failed) = true;
        }
        if (p_to_table != nullptr) {
            EXPECT_EQ(ku_iconv_close_1(p_to_table), 0);
        }
        if (p_from_table != nullptr) {
            EXPECT_EQ(ku_iconv_close_1(p_from_table), 0);
        }
        if (!failed_as_asked(call::allocation)) {
            EXPECT_EQ(rc, 0);
            break;
        }
    }
    EXPECT_TRUE(both_failed);
    EXPECT_TRUE(one_failed);
}

// ---- Threads ----

TEST(threads_open_and_close, trees_at_once)
{
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([] {
            for (int round = 0; round < 50; ++round) {
                rg_opaque_handle_t tree = nullptr;
                EXPECT_EQ(rg_open_tree_1(&tree, 0, 0), 0);
                EXPECT_EQ(rg_close_tree_1(tree), 0);
            }
        });
    for (std::thread & thread : threads)
        thread.join();
}

TEST(threads_mount_and_unmount, in_one_tree_at_once)
{
    const temp_dir           dir;
    const open_tree          tree;
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([&, i] {
            const kt_char_ptr_t p_path      = text("/m" + std::to_string(i));
            const kt_char_ptr_t p_directory = text(dir.path());
            for (int round = 0; round < 50; ++round) {
                EXPECT_EQ(rg_mount_local_tree_1(tree, p_path, p_directory, 1), 0);
                EXPECT_EQ(rg_unmount_local_tree_1(tree, p_path), 0);
            }
        });
    for (std::thread & thread : threads)
        thread.join();
    EXPECT_EQ(inside(tree).p_mount_points, nullptr);
}
