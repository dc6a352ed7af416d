// SPDX-License-Identifier: MIT
// What every exported call does around its worker: handles, locks, the open mode, completion, the error record, trace.
#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "exported_calls.h"
#include "frame/rg_i_call_frame.h"
#include "support/faults.h"
#include "support/registry.h"
#include "support/rows.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

bool is_free(pthread_mutex_t & mutex)
{
    const bool taken = pthread_mutex_trylock(&mutex) == 0;
    if (taken)
        pthread_mutex_unlock(&mutex);
    return taken;
}

// The mutex of all updates, held by the test.
class updates_held_up
{
  public:
    updates_held_up() { pthread_mutex_lock(&ForkMutex); }
    ~updates_held_up() { pthread_mutex_unlock(&ForkMutex); }
    updates_held_up(const updates_held_up &)             = delete;
    updates_held_up & operator=(const updates_held_up &) = delete;
};

const std::vector<rg_column_t> & two_columns()
{
    static const std::vector<rg_column_t> columns = {column("K", KT_UINT32, RG_PRIMARY_KEY), column("V", KT_CHAR_PTR)};
    return columns;
}

kt_int32_t add(rg_opaque_handle_t table, kt_uint32_t key, const std::string & value = "v")
{
    return add_row(table, {{"K", uint32(key)}, {"V", string(value)}});
}

class in_a_frame : public ::testing::Test, public registry_of_tables
{
  public:
    rg_opaque_handle_t kept(kt_int32_t mode = implicit_writing) { return make({false, true}, two_columns(), mode); }
    rg_opaque_handle_t transient(kt_int32_t mode = implicit_writing)
    {
        return make({true, false}, two_columns(), mode);
    }
    rg_opaque_handle_t kept_with_rows(kt_uint32_t rows, kt_int32_t mode = implicit_writing)
    {
        const rg_opaque_handle_t table = kept(mode);
        for (kt_uint32_t key = 0; key < rows; ++key)
            EXPECT_EQ(add(table, key), 0);
        return table;
    }
};

void expect_record(kt_int32_t code, kt_int32_t message_index)
{
    EXPECT_EQ(error_code(), code);
    EXPECT_EQ(error_message_index(), message_index);
}

} // namespace

// ---- Handles and trace ----

TEST(each_exported_call, with_a_null_handle_returns_100_between_its_entry_and_its_exit)
{
    trace_catcher trace(1, 0);
    for (const exported_call & c : all_calls()) {
        ku_set_no_error_1();
        trace.clear();
        EXPECT_EQ(c.call(nullptr), 100) << c.name;
        expect_record(100, 7);
        ASSERT_EQ(trace.events().size(), 2u) << c.name;
        const event & entry = trace.events()[0];
        EXPECT_EQ(entry.kind, TR_EVENT_ID) << c.name;
        EXPECT_EQ(entry.component, "_RGA");
        EXPECT_EQ(entry.id, c.entry_id) << c.name;
        const event & exit = trace.events()[1];
        EXPECT_EQ(exit.kind, TR_EVENT_VALUES) << c.name;
        EXPECT_EQ(exit.component, "_RGA");
        EXPECT_EQ(exit.id, c.entry_id + 1) << c.name;
        EXPECT_EQ(exit.values, std::vector<std::uint32_t>{100}) << c.name;
    }
}

TEST(each_exported_call, makes_no_event_at_level_0_and_sets_the_record_all_the_same)
{
    const trace_catcher trace(0, 0);
    for (const exported_call & c : all_calls()) {
        ku_set_no_error_1();
        EXPECT_EQ(c.call(nullptr), 100) << c.name;
        expect_record(100, 7);
    }
    EXPECT_TRUE(trace.events().empty());
}

TEST(each_exported_call, releases_the_mutex_of_all_updates_after_a_null_handle)
{
    for (const exported_call & c : all_calls()) {
        EXPECT_EQ(c.call(nullptr), 100);
        EXPECT_TRUE(is_free(ForkMutex)) << c.name;
    }
}

TEST_F(in_a_frame, the_exit_event_carries_the_result_also_of_a_success)
{
    const rg_opaque_handle_t table = transient();
    trace_catcher            trace(1, 1);
    EXPECT_EQ(add(table, 1), 0);
    EXPECT_EQ(add(table, 1), 108);
    ASSERT_EQ(trace.events().size(), 5u); // entry, exit, entry, the failure's place, exit
    EXPECT_EQ(trace.events()[1].values, std::vector<std::uint32_t>{0});
    EXPECT_EQ(trace.events()[2].id, 5u);
    EXPECT_EQ(trace.events()[3].kind, TR_EVENT_ERROR);
    EXPECT_EQ(trace.events()[4].id, 6u);
    EXPECT_EQ(trace.events()[4].values, std::vector<std::uint32_t>{108});
}

TEST_F(in_a_frame, an_update_is_entered_without_locks_and_exits_with_all_released_and_the_record_cleared)
{
    const rg_opaque_handle_t table = transient();
    trace_catcher            trace(1, 0);
    EXPECT_EQ(rg_close_tree_1(nullptr), 100); // a record to clear
    std::vector<kt_int32_t> codes;
    trace.on_event([&](const event &) {
        codes.push_back(error_code());
        EXPECT_TRUE(is_free(ForkMutex));
        EXPECT_EQ(object_of(table).lock.lock_count, 0);
    });
    EXPECT_EQ(add(table, 1), 0);
    EXPECT_EQ(codes, (std::vector<kt_int32_t>{100, 0}));
}

TEST_F(in_a_frame, a_read_is_entered_without_a_lock_and_exits_with_it_released_and_the_record_cleared)
{
    const rg_opaque_handle_t table = transient();
    EXPECT_EQ(add(table, 1), 0);
    trace_catcher trace(1, 0);
    EXPECT_EQ(rg_close_tree_1(nullptr), 100);
    std::vector<kt_int32_t> codes;
    trace.on_event([&](const event &) {
        codes.push_back(error_code());
        EXPECT_EQ(object_of(table).lock.lock_count, 0);
    });
    EXPECT_EQ(read_key(table, uint32(1), "K").rc, 0);
    EXPECT_EQ(codes, (std::vector<kt_int32_t>{100, 0}));
}

TEST_F(in_a_frame, tree_calls_exit_with_the_tree_unlocked_and_the_record_cleared)
{
    const auto *  p_tree = static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    trace_catcher trace(1, 0);
    const auto    expect_frame = [&](const std::function<kt_int32_t()> & call) {
        trace.on_event(nullptr);
        EXPECT_EQ(rg_close_tree_1(nullptr), 100); // a record to clear
        std::vector<kt_int32_t> codes;
        trace.on_event([&](const event &) {
            codes.push_back(error_code());
            EXPECT_EQ(p_tree->lock.lock_count, 0);
            EXPECT_TRUE(is_free(ForkMutex));
        });
        EXPECT_EQ(call(), 0);
        EXPECT_EQ(codes, (std::vector<kt_int32_t>{100, 0}));
    };
    rg_opaque_handle_t table = nullptr;
    rg_column_t        key   = column("K", KT_UINT32, RG_PRIMARY_KEY);
    expect_frame([&] { return rg_mount_local_tree_1(tree, text("/m"), text(directory.path()), 1); });
    expect_frame([&] { return rg_create_table_1(tree, text("/m/t"), &key, 1, RG_MODE_WRITE, &table); });
    expect_frame([&] { return rg_close_table_1(table); });
    expect_frame([&] { return rg_open_table_1(tree, text("/m/t"), RG_MODE_READ, &table); });
    expect_frame([&] { return rg_unmount_local_tree_1(tree, text("/m")); });
}

TEST_F(in_a_frame, a_missing_key_is_told_with_code_202_and_the_text_numbered_213)
{
    const rg_opaque_handle_t table = kept_with_rows(1);
    EXPECT_EQ(read_key(table, uint32(77), "V").rc, 202);
    expect_record(202, 31);
    EXPECT_EQ(error_text(), "2605-213 There is no row corresponding to the specified key value (77) in table (" +
                                directory.file("table") + ").\n");
}

// ---- The open mode ----

TEST_F(in_a_frame, a_table_open_for_reading_refuses_updates_with_206_before_the_worker_runs)
{
    rg_opaque_handle_t table = kept_with_rows(1);
    EXPECT_EQ(rg_close_table_1(table), 0);
    table              = open_table(tree, "/kept/table", RG_MODE_READ);
    const auto before  = picture_of(table);
    kt_value_t value   = uint32(0);
    const auto refused = [](kt_int32_t rc) {
        EXPECT_EQ(rc, 206);
        expect_record(206, 23);
    };
    // Arguments that a worker would refuse with another code.
    refused(rg_add_row_1(table, nullptr, nullptr, 1));
    refused(rg_set_field_by_index_1(table, -1, nullptr, &value));
    refused(rg_set_field_by_fixed_index_1(table, -1, nullptr, &value));
    refused(rg_set_field_by_key_1(table, value, nullptr, &value));
    refused(rg_set_fields_by_index_1(table, -1, nullptr, nullptr, 1));
    refused(rg_set_fields_by_fixed_index_1(table, -1, nullptr, nullptr, 1));
    refused(rg_set_fields_by_key_1(table, value, nullptr, nullptr, 1));
    refused(rg_delete_row_by_index_1(table, 99));
    refused(rg_apply_1(table, 0));
    refused(rg_commit_1(table));
    refused(rg_abort_1(table));
    kt_binary_t binary{1, {0}};
    refused(rg_set_application_metadata_1(table, &binary));
    EXPECT_TRUE(picture_of(table) == before);
    EXPECT_EQ(read_key(table, uint32(0), "K").rc, 0);
}

// ---- Implicit completion ----

TEST_F(in_a_frame, an_implicitly_controlled_update_is_applied_and_committed_when_it_returns)
{
    const rg_opaque_handle_t table  = kept();
    const kt_uint64_t        before = object_of(table).change_counter;
    EXPECT_EQ(add(table, 1), 0);
    EXPECT_EQ(state_of(table, 0), rg_row_state_t{RG_ROW_STATE_COMMITTED});
    EXPECT_EQ(object_of(table).total_committed_rows, 1u);
    EXPECT_EQ(object_of(table).change_counter, before + 1);
    EXPECT_EQ(object_of(table).ready_for_commit, 0u);
}

TEST_F(in_a_frame, an_explicitly_controlled_update_stays_pending)
{
    const rg_opaque_handle_t table = kept_with_rows(1, explicit_writing);
    EXPECT_EQ(state_of(table, 0), rg_row_state_t{RG_ROW_STATE_ADDED});
    EXPECT_EQ(object_of(table).total_committed_rows, 0u);
}

TEST_F(in_a_frame, apply_commit_and_abort_do_not_complete_by_themselves)
{
    const rg_opaque_handle_t table = transient(explicit_writing);
    EXPECT_EQ(add(table, 1), 0);
    object_of(table).implicitly_controlled = 1;
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object_of(table).ready_for_commit, 1u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_of(table, 0), rg_row_state_t{RG_ROW_STATE_COMMITTED});
}

TEST_F(in_a_frame, a_worker_that_fails_triggers_no_apply_and_leaves_pending_rows_alone)
{
    // Rows pending from explicit control, and an implicitly controlled opener after it.
    rg_opaque_handle_t table = transient(explicit_writing);
    EXPECT_EQ(add(table, 1), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    table             = open_table(tree, "/scratch/table", RG_MODE_WRITE);
    const auto before = picture_of(table);

    EXPECT_EQ(add(table, 1), 108);
    expect_record(108, 15);
    EXPECT_EQ(state_of(table, 0), rg_row_state_t{RG_ROW_STATE_ADDED});
    EXPECT_TRUE(picture_of(table) == before);

    EXPECT_EQ(add(table, 2), 0); // and a worker that succeeds completes all that is pending
    EXPECT_EQ(state_of(table, 0), rg_row_state_t{RG_ROW_STATE_COMMITTED});
    EXPECT_EQ(state_of(table, 1), rg_row_state_t{RG_ROW_STATE_COMMITTED});
}

TEST_F(in_a_frame, a_worker_that_fails_makes_no_file_call)
{
    const rg_opaque_handle_t table = kept_with_rows(1);
    const fault_scope        faults;
    EXPECT_EQ(add(table, 0), 108);
    EXPECT_EQ(calls_made(call::writev), 0u);
    EXPECT_EQ(calls_made(call::write), 0u);
    EXPECT_EQ(calls_made(call::fsync), 0u);
}

TEST_F(in_a_frame, a_failed_apply_takes_the_update_back_and_its_code_is_returned)
{
    const rg_opaque_handle_t table  = kept_with_rows(2);
    const auto               before = picture_of(table);
    {
        const fault_scope faults;
        fail_call(call::writev, 1, EIO);
        EXPECT_EQ(add(table, 7), 10);
        expect_record(10, 1);
        EXPECT_EQ(error_text().find("2605-010 The writev system call unexpectedly returned an errno of 5 "), 0u);
    }
    EXPECT_EQ(picture_of(table).packed_index, before.packed_index);
    EXPECT_TRUE(picture_of(table).updated.empty());
    EXPECT_EQ(object_of(table).ready_for_commit, 0u);
    EXPECT_EQ(read_key(table, uint32(7), "K").rc, 202);
    EXPECT_EQ(add(table, 7), 0);
    EXPECT_EQ(read_key(table, uint32(7), "K").rc, 0);
}

TEST_F(in_a_frame, a_full_file_system_in_an_apply_is_told_with_16_and_its_mount)
{
    const rg_opaque_handle_t table = kept_with_rows(1);
    const fault_scope        faults;
    fail_call(call::writev, 1, ENOSPC);
    EXPECT_EQ(add(table, 7), 16);
    expect_record(16, 30);
    EXPECT_EQ(object_of(table).total_applied_rows, 1u);
}

TEST_F(in_a_frame, a_failed_commit_returns_its_code_and_is_not_taken_back)
{
    const rg_opaque_handle_t table = kept_with_rows(1);
    {
        const fault_scope faults;
        fail_call(call::write, 1, EIO); // the one that would switch the old commit record off
        EXPECT_EQ(add(table, 7), 10);
        expect_record(10, 1);
        EXPECT_EQ(error_text().find("2605-010 The write system call unexpectedly returned an errno of 5 "), 0u);
    }
    EXPECT_EQ(object_of(table).ready_for_commit, 1u);
    EXPECT_EQ(state_of(table, 1), rg_row_state_t{RG_ROW_STATE_ADDED});
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(read_key(table, uint32(7), "K").rc, 0);
}

// ---- The rewrite decision ----

namespace
{

kt_uint32_t rewrite_is_due(kt_uint32_t file_length, kt_uint32_t used_bytes)
{
    static rg_i_table_t table;
    table.file_length                   = file_length;
    table.record_buffer_pool.used_bytes = used_bytes;
    return rg_i_rewrite_is_due(&table);
}

} // namespace

TEST(the_rewrite_decision, a_file_of_16384_bytes_is_not_rewritten_and_one_of_16385_is)
{
    EXPECT_EQ(rewrite_is_due(16384, 10), 0u);
    EXPECT_EQ(rewrite_is_due(16385, 10), 1u);
}

TEST(the_rewrite_decision, goes_by_the_integer_quotient_so_that_exactly_50_percent_does_not_rewrite)
{
    EXPECT_EQ(rewrite_is_due(20000, 9999), 1u); // 49.995 is 49
    EXPECT_EQ(rewrite_is_due(20000, 9980), 1u); // 49.9
    EXPECT_EQ(rewrite_is_due(20000, 10000), 0u);
    EXPECT_EQ(rewrite_is_due(20000, 20000), 0u);
}

TEST(the_rewrite_decision, wraps_from_42949673_used_bytes_on)
{
    EXPECT_EQ(rewrite_is_due(50000000, 42949672), 0u);
    EXPECT_EQ(rewrite_is_due(50000000, 42949673), 1u);
}

TEST(the_rewrite_decision, a_transient_table_has_no_file_to_rewrite)
{
    EXPECT_EQ(rewrite_is_due(0, 0), 0u);
    EXPECT_EQ(rewrite_is_due(0, 1), 0u);
}

TEST_F(in_a_frame, implicit_completion_rewrites_at_16385_bytes_and_not_at_16384)
{
    const rg_opaque_handle_t table = kept_with_rows(1);
    const fault_scope        faults;
    object_of(table).file_length = 16384;
    EXPECT_EQ(add(table, 1), 0);
    EXPECT_EQ(calls_made(call::rename), 0u);
    object_of(table).file_length = 16385;
    EXPECT_EQ(add(table, 2), 0);
    EXPECT_EQ(calls_made(call::rename), 1u);
}

// ---- Locks ----

TEST_F(in_a_frame, a_lock_that_fails_gives_10_releases_the_mutex_of_all_updates_and_touches_nothing)
{
    const rg_opaque_handle_t table    = transient();
    const auto               before   = picture_of(table);
    kt_char_ptr_t            names[]  = {text("K"), text("V")};
    kt_value_t               key      = uint32(1);
    kt_value_t               value    = string("v");
    kt_value_t *             values[] = {&key, &value};
    {
        const fault_scope faults;
        fail_call(call::mutex_lock, 2, EDEADLK);
        EXPECT_EQ(rg_add_row_1(table, names, values, 2), 10);
        expect_record(10, 1);
    }
    EXPECT_TRUE(is_free(ForkMutex));
    EXPECT_TRUE(picture_of(table) == before);
}

TEST_F(in_a_frame, a_lock_that_fails_in_a_read_gives_10)
{
    const rg_opaque_handle_t table = transient();
    kt_value_t               value = uint32(1);
    const kt_char_ptr_t      name  = text("K");
    const fault_scope        faults;
    fail_call(call::mutex_lock, 1, EDEADLK);
    EXPECT_EQ(rg_get_field_by_key_1(table, value, name, &value), 10);
    expect_record(10, 1);
}

TEST_F(in_a_frame, a_mutex_of_all_updates_that_fails_is_not_noticed)
{
    const rg_opaque_handle_t table    = transient();
    kt_char_ptr_t            names[]  = {text("K"), text("V")};
    kt_value_t               key      = uint32(1);
    kt_value_t               value    = string("v");
    kt_value_t *             values[] = {&key, &value};
    {
        const fault_scope faults;
        fail_call(call::mutex_lock, 1, EDEADLK);
        EXPECT_EQ(rg_add_row_1(table, names, values, 2), 0);
    }
    EXPECT_TRUE(is_free(ForkMutex));
}

TEST_F(in_a_frame, reads_and_opens_and_closes_go_on_while_updates_are_held_up)
{
    rg_opaque_handle_t table = kept_with_rows(1);
    kt_binary_t        binary{1, {7}};
    EXPECT_EQ(rg_set_application_metadata_1(table, &binary), 0);
    const updates_held_up held;
    EXPECT_EQ(read_key(table, uint32(0), "K").rc, 0);
    EXPECT_EQ(read_fixed(table, 0, "K").rc, 0);
    EXPECT_EQ(find_key(table, uint32(0)), 0);
    kt_binary_t * p_binary = nullptr;
    EXPECT_EQ(rg_get_application_metadata_1(table, &p_binary), 0);
    std::free(p_binary);
    EXPECT_EQ(rg_close_table_1(table), 0);
    table = open_table(tree, "/kept/table", RG_MODE_WRITE);
    EXPECT_EQ(rg_close_table_1(table), 0);
    open_tree other;
    other.close();
    EXPECT_EQ(rg_unmount_local_tree_1(tree, text("/kept")), 0);
}

TEST_F(in_a_frame, each_update_waits_while_updates_are_held_up)
{
    const rg_opaque_handle_t table = transient(explicit_writing);
    std::thread              updater;
    bool                     done = false; // guarded by ForkMutex
    {
        const updates_held_up held;
        updater = std::thread([&] {
            EXPECT_EQ(add(table, 1), 0);
            pthread_mutex_lock(&ForkMutex);
            done = true;
            pthread_mutex_unlock(&ForkMutex);
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        EXPECT_FALSE(done);
        EXPECT_EQ(object_of(table).total_applied_rows, 0u);
    }
    updater.join();
    EXPECT_TRUE(done);
}

TEST_F(in_a_frame, frames_allocate_nothing)
{
    const rg_opaque_handle_t table = transient();
    EXPECT_EQ(add(table, 1), 0);
    kt_value_t          value;
    const kt_value_t    key  = uint32(1);
    const kt_char_ptr_t name = text("K");
    const fault_scope   faults;
    EXPECT_EQ(rg_get_field_by_key_1(table, key, name, &value), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(rg_apply_1(nullptr, 0), 100);
    EXPECT_EQ(calls_made(call::allocation), 0u);
}

// ---- Threads ----

TEST(threads_update_and_read, one_table_at_once_and_every_row_is_there)
{
    registry_of_tables       registry;
    const rg_opaque_handle_t table = registry.make({true, false}, two_columns(), RG_MODE_WRITE);
    std::vector<std::thread> threads;
    for (kt_uint32_t t = 0; t < 2; ++t)
        threads.emplace_back([table, t] {
            for (kt_uint32_t i = 0; i < 100; ++i)
                EXPECT_EQ(add(table, t * 100 + i), 0);
        });
    for (int t = 0; t < 2; ++t)
        threads.emplace_back([table] {
            for (kt_uint32_t i = 0; i < 200; ++i) {
                const kt_int32_t rc = read_key(table, uint32(i), "K").rc;
                EXPECT_TRUE(rc == 0 || rc == 202) << rc;
            }
        });
    for (std::thread & thread : threads)
        thread.join();
    for (kt_uint32_t key = 0; key < 200; ++key)
        EXPECT_EQ(read_key(table, uint32(key), "K").value.val_uint32, key);
}
