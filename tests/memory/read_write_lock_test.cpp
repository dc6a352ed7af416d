// SPDX-License-Identifier: MIT
// The read-write lock: who passes and who waits, what its counts say, and every failure of a pthread call.
#include "rg_i_read_write_lock.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sched.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "support/faults.h"
#include "support/registry.h"

using kt_test::call;
using kt_test::calls_made;
using kt_test::error_code;
using kt_test::error_message_index;
using kt_test::error_text;
using kt_test::fail_call;
using kt_test::fault_scope;

namespace
{

struct counts_t {
    kt_int32_t lock_count;
    kt_int32_t waiting_readers;
    kt_int32_t waiting_writers;
    bool       operator==(const counts_t &) const = default;
};

class test_lock
{
  public:
    test_lock() { rg_i_rw_open(&lock); }
    ~test_lock() { rg_i_rw_close(&lock); }
    test_lock(const test_lock &)             = delete;
    test_lock & operator=(const test_lock &) = delete;

    // Under the mutex: who is counted as waiting and doesn't hold the lock is inside its wait by then.
    counts_t counts()
    {
        pthread_mutex_lock(&lock.lock);
        const counts_t result{lock.lock_count, lock.waiting_readers, lock.waiting_writers};
        pthread_mutex_unlock(&lock.lock);
        return result;
    }
    void wait_for(const counts_t & wanted)
    {
        while (!(counts() == wanted))
            sched_yield();
    }

    rg_i_read_write_lock_t lock;
};

void wait_until(const std::function<bool()> & condition)
{
    while (!condition())
        sched_yield();
}

// A system call's report: code 10 with index 1, the call's name and the number that it returned.
void expect_report(kt_int32_t rc, const std::string & name, int the_errno)
{
    EXPECT_EQ(rc, RG_E_SYSTEM_CALL);
    EXPECT_EQ(error_code(), RG_E_SYSTEM_CALL);
    EXPECT_EQ(error_message_index(), 1);
    EXPECT_NE(error_text().find("The " + name + " system call"), std::string::npos) << error_text();
    EXPECT_NE(error_text().find("errno of " + std::to_string(the_errno)), std::string::npos) << error_text();
}

} // namespace

// ---- One thread ----

TEST(lock_counts, are_zero_after_opening)
{
    test_lock l;
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 0}));
}

TEST(lock_counts, say_minus_one_exactly_while_a_writer_holds_the_lock)
{
    test_lock l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
    EXPECT_EQ(l.counts().lock_count, -1);
    ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    EXPECT_EQ(l.counts().lock_count, 0);
}

TEST(lock_counts, say_how_many_readers_hold_the_lock)
{
    test_lock l;
    for (kt_int32_t held = 1; held <= 3; ++held) {
        ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
        EXPECT_EQ(l.counts(), (counts_t{held, 0, 0}));
    }
    for (kt_int32_t held = 2; held >= 0; --held) {
        ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
        EXPECT_EQ(l.counts(), (counts_t{held, 0, 0}));
    }
}

TEST(lock_counts, waiting_writers_grows_with_every_write_lock_and_nothing_depends_on_it)
{
    test_lock l;
    for (kt_int32_t pairs = 1; pairs <= 100; ++pairs) {
        ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
        ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
        ASSERT_EQ(l.counts(), (counts_t{0, 0, pairs}));
    }
    for (const kt_int32_t value : {INT32_MAX, INT32_MIN, -1}) {
        l.lock.waiting_writers = value;
        ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
        ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
        ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
        EXPECT_EQ(l.counts().lock_count, -1);
        ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
        EXPECT_EQ(l.counts(), (counts_t{0, 0, static_cast<kt_int32_t>(static_cast<kt_uint32_t>(value) + 1)}));
    }
}

TEST(lock_signals, the_last_reader_signals_one_writer_whether_or_not_one_waits)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
    EXPECT_EQ(calls_made(call::cond_signal), 0u);
    ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
    EXPECT_EQ(calls_made(call::cond_signal), 1u);
    EXPECT_EQ(calls_made(call::cond_broadcast), 0u);
}

TEST(lock_signals, a_writer_that_no_reader_waits_for_signals_one_writer)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
    ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    EXPECT_EQ(calls_made(call::cond_signal), 1u);
    EXPECT_EQ(calls_made(call::cond_broadcast), 0u);
}

TEST(lock_owners, are_not_checked_so_anybody_can_unlock_for_a_writer)
{
    test_lock l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    EXPECT_EQ(l.counts().lock_count, 0);
}

// ---- Failures ----

TEST(lock_failures, a_mutex_that_cannot_be_locked_changes_nothing)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    for (const auto operation : {rg_i_rw_lock_read, rg_i_rw_unlock_read, rg_i_rw_lock_write, rg_i_rw_unlock_write}) {
        fail_call(call::mutex_lock, 1, EINVAL);
        expect_report(operation(&l.lock), "pthread_mutex_lock", EINVAL);
        EXPECT_EQ(l.counts(), (counts_t{1, 0, 0}));
    }
    ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
}

TEST(lock_failures, a_mutex_that_cannot_be_unlocked_is_reported_and_the_count_stays_changed)
{
    // The injected failure leaves the mutex held, so it is unlocked by hand after each operation.
    const auto fails = [](test_lock & l, kt_int32_t (*operation)(rg_i_read_write_lock_t *), const counts_t & counts) {
        fail_call(call::mutex_unlock, 1, EPERM);
        expect_report(operation(&l.lock), "pthread_mutex_unlock", EPERM);
        pthread_mutex_unlock(&l.lock.lock);
        EXPECT_EQ(l.counts(), counts);
    };
    fault_scope faults;
    test_lock   l;
    fails(l, rg_i_rw_lock_read, {1, 0, 0});
    fails(l, rg_i_rw_unlock_read, {0, 0, 0});
    fails(l, rg_i_rw_lock_write, {-1, 0, 1});
    fails(l, rg_i_rw_unlock_write, {0, 0, 1});
}

TEST(lock_failures, a_readers_failed_wait_leaves_the_lock_as_it_was)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
    fail_call(call::cond_wait, 1, EINVAL);
    expect_report(rg_i_rw_lock_read(&l.lock), "pthread_cond_wait", EINVAL);
    EXPECT_EQ(calls_made(call::cond_wait), 1u) << "nothing retries";
    EXPECT_EQ(l.counts(), (counts_t{-1, 0, 1}));
    ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
}

TEST(lock_failures, a_writers_failed_wait_takes_its_count_down_behind_the_unlock)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    kt_int32_t count_at_unlock = 0;
    fail_call(call::cond_wait, 1, EINVAL);
    kt_test::before_call(call::mutex_unlock, 1, [&] { count_at_unlock = l.lock.waiting_writers; });
    expect_report(rg_i_rw_lock_write(&l.lock), "pthread_cond_wait", EINVAL);
    EXPECT_EQ(count_at_unlock, 1);
    EXPECT_EQ(l.counts(), (counts_t{1, 0, 0}));
    ASSERT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
}

TEST(lock_failures, a_readers_failed_signal_leaves_the_lock_held)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    fail_call(call::cond_signal, 1, EINVAL);
    expect_report(rg_i_rw_unlock_read(&l.lock), "pthread_cond_signal", EINVAL);
    EXPECT_EQ(l.counts(), (counts_t{1, 0, 0}));
    EXPECT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 0}));
}

TEST(lock_failures, a_writers_failed_signal_leaves_the_lock_held)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
    fail_call(call::cond_signal, 1, EINVAL);
    expect_report(rg_i_rw_unlock_write(&l.lock), "pthread_cond_signal", EINVAL);
    EXPECT_EQ(l.counts(), (counts_t{-1, 0, 1}));
    EXPECT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 1}));
}

// ---- Threads ----

TEST(threads_read_write_lock, readers_proceed_while_a_writer_waits)
{
    test_lock l;
    ASSERT_EQ(rg_i_rw_lock_read(&l.lock), 0);
    std::thread writer([&] {
        EXPECT_EQ(rg_i_rw_lock_write(&l.lock), 0);
        EXPECT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    });
    l.wait_for({1, 0, 1});

    EXPECT_EQ(rg_i_rw_lock_read(&l.lock), 0) << "also one that holds the lock already";
    std::thread([&] { EXPECT_EQ(rg_i_rw_lock_read(&l.lock), 0); }).join();
    EXPECT_EQ(l.counts(), (counts_t{3, 0, 1}));
    for (int i = 0; i < 3; ++i)
        EXPECT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
    writer.join();
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 1}));
}

TEST(threads_read_write_lock, a_writer_that_unlocks_lets_all_readers_go_first_and_the_last_of_them_one_writer)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);

    std::atomic<int>         readers_in{0}, writers_in{0};
    std::atomic<bool>        readers_go{false}, writers_go{false};
    std::vector<std::thread> threads;
    for (int i = 0; i < 2; ++i)
        threads.emplace_back([&] {
            EXPECT_EQ(rg_i_rw_lock_write(&l.lock), 0);
            ++writers_in;
            wait_until([&] { return writers_go.load(); });
            EXPECT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
        });
    for (int i = 0; i < 3; ++i)
        threads.emplace_back([&] {
            EXPECT_EQ(rg_i_rw_lock_read(&l.lock), 0);
            ++readers_in;
            wait_until([&] { return readers_go.load(); });
            EXPECT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
        });
    l.wait_for({-1, 3, 3}); // this thread's own write lock is among the three

    ASSERT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    EXPECT_EQ(calls_made(call::cond_broadcast), 1u);
    EXPECT_EQ(calls_made(call::cond_signal), 0u) << "no writer is woken yet";
    wait_until([&] { return readers_in == 3; });
    EXPECT_EQ(writers_in, 0);
    EXPECT_EQ(l.counts(), (counts_t{3, 0, 3}));

    readers_go = true;
    wait_until([&] { return writers_in == 1; });
    EXPECT_EQ(calls_made(call::cond_signal), 1u) << "the last reader wakes exactly one writer";
    EXPECT_EQ(l.counts(), (counts_t{-1, 0, 3}));
    EXPECT_EQ(writers_in, 1);

    writers_go = true;
    for (std::thread & thread : threads)
        thread.join();
    EXPECT_EQ(writers_in, 2);
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 3}));
}

TEST(threads_read_write_lock, a_failed_broadcast_leaves_the_writer_in_place_and_the_readers_waiting)
{
    fault_scope faults;
    test_lock   l;
    ASSERT_EQ(rg_i_rw_lock_write(&l.lock), 0);
    std::thread reader([&] {
        EXPECT_EQ(rg_i_rw_lock_read(&l.lock), 0);
        EXPECT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
    });
    l.wait_for({-1, 1, 1});
    fail_call(call::cond_broadcast, 1, EINVAL);
    expect_report(rg_i_rw_unlock_write(&l.lock), "pthread_cond_broadcast", EINVAL);
    EXPECT_EQ(l.counts(), (counts_t{-1, 1, 1}));
    EXPECT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
    reader.join();
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 1}));
}

TEST(threads_read_write_lock, writers_exclude_everybody)
{
    test_lock                l;
    constexpr int            rounds = 500;
    long                     value  = 0; // guarded by the lock
    std::vector<std::thread> threads;
    for (int i = 0; i < 2; ++i) {
        threads.emplace_back([&] {
            for (int round = 0; round < rounds; ++round) {
                EXPECT_EQ(rg_i_rw_lock_write(&l.lock), 0);
                ++value;
                EXPECT_EQ(rg_i_rw_unlock_write(&l.lock), 0);
            }
        });
        threads.emplace_back([&] {
            for (int round = 0; round < rounds; ++round) {
                EXPECT_EQ(rg_i_rw_lock_read(&l.lock), 0);
                const long seen = value;
                sched_yield();
                EXPECT_EQ(value, seen);
                EXPECT_EQ(rg_i_rw_unlock_read(&l.lock), 0);
            }
        });
    }
    for (std::thread & thread : threads)
        thread.join();
    EXPECT_EQ(value, 2 * rounds);
    EXPECT_EQ(l.counts(), (counts_t{0, 0, 2 * rounds}));
}

// ---- Cancellation ----

namespace
{

// Cancels a thread in its wait. The lock's mutex stays held by the thread that is gone, so the lock can't be destroyed:
// it stays reachable and is left alone.
const rg_i_read_write_lock_t & lock_after_cancellation(void * (*waiting_thread)(void *), bool hold_for_writing)
{
    static auto * const p_left_alone = new std::vector<rg_i_read_write_lock_t *>; // outlives every destructor
    auto * const        p_lock       = new rg_i_read_write_lock_t;
    p_left_alone->push_back(p_lock);
    rg_i_rw_open(p_lock);
    EXPECT_EQ(hold_for_writing ? rg_i_rw_lock_write(p_lock) : rg_i_rw_lock_read(p_lock), 0);

    fault_scope faults;
    pthread_t   thread;
    EXPECT_EQ(pthread_create(&thread, nullptr, waiting_thread, p_lock), 0);
    wait_until([] { return calls_made(call::cond_wait) == 1; });
    EXPECT_EQ(pthread_cancel(thread), 0);
    void * p_result = nullptr;
    EXPECT_EQ(pthread_join(thread, &p_result), 0);
    EXPECT_EQ(p_result, PTHREAD_CANCELED);
    return *p_lock;
}

} // namespace

TEST(cancelled_waits, of_a_reader_put_the_count_right_and_leave_the_mutex_held)
{
    const rg_i_read_write_lock_t & lock = lock_after_cancellation(
        [](void * p) -> void * {
            return rg_i_rw_lock_read(static_cast<rg_i_read_write_lock_t *>(p)) == 0 ? p : nullptr;
        },
        true);
    EXPECT_EQ(lock.waiting_readers, 0);
    EXPECT_EQ(lock.waiting_writers, 1);
    EXPECT_EQ(lock.lock_count, -1);
    EXPECT_EQ(pthread_mutex_trylock(const_cast<pthread_mutex_t *>(&lock.lock)), EBUSY);
}

TEST(cancelled_waits, of_a_writer_put_the_count_right_and_leave_the_mutex_held)
{
    const rg_i_read_write_lock_t & lock = lock_after_cancellation(
        [](void * p) -> void * {
            return rg_i_rw_lock_write(static_cast<rg_i_read_write_lock_t *>(p)) == 0 ? p : nullptr;
        },
        false);
    EXPECT_EQ(lock.waiting_readers, 0);
    EXPECT_EQ(lock.waiting_writers, 0);
    EXPECT_EQ(lock.lock_count, 1);
    EXPECT_EQ(pthread_mutex_trylock(const_cast<pthread_mutex_t *>(&lock.lock)), EBUSY);
}
