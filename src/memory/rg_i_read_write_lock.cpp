// SPDX-License-Identifier: MIT
// rg_i_read_write_lock: the lock of each tree and each table, out of one mutex and two condition variables.
//
// Layer: memory. Calls the threads library and the failure reports only.
// Always holds: the three counts change under the mutex alone, and the mutex is held inside these functions only. A
// reader waits for a writer that holds the lock, never for one that waits: a steady stream of readers starves writers.
// Failure: RG_E_SYSTEM_CALL with the name of the pthread call and its result. A failed signal or broadcast restores the
// count, so that the caller still holds the lock; a failed wait leaves the lock as it was found.
// Cancellation: a wait is a cancellation point, and callers must not let a thread be cancelled in it. The handlers put
// the counts right and no more: the mutex, which the cancelled wait has taken back, stays held.
#include "rg_i_read_write_lock.h"

#include <cstdint>
#include <cstring>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_read_write_lock 1.0";

// waiting_writers grows for ever, so it may wrap.
void add_wrapping(kt_int32_t & count, kt_uint32_t delta)
{
    count = static_cast<kt_int32_t>(static_cast<kt_uint32_t>(count) + delta);
}

constexpr kt_uint32_t one_less = UINT32_MAX;

void decrement_readers_if_thread_cancelled(void * p_lock)
{
    auto * const p_rwlock = static_cast<rg_i_read_write_lock_t *>(p_lock);
    if (p_rwlock->waiting_readers != 0)
        --p_rwlock->waiting_readers;
}

void decrement_writers_if_thread_cancelled(void * p_lock)
{
    auto * const p_rwlock = static_cast<rg_i_read_write_lock_t *>(p_lock);
    if (p_rwlock->waiting_writers != 0)
        add_wrapping(p_rwlock->waiting_writers, one_less);
}

// Both waits run with the mutex held, and return 0 or what the wait returned. They are apart from the operations
// because pushing a cancellation handler saves the registers, which an uncontended lock needn't pay for; for the same
// reason the result lives in memory.
[[gnu::noinline]] int wait_to_read(rg_i_read_write_lock_t * p_rwlock)
{
    volatile int result = 0;
    pthread_cleanup_push(decrement_readers_if_thread_cancelled, p_rwlock);
    while (result == 0 && p_rwlock->lock_count < 0)
        result = pthread_cond_wait(&p_rwlock->read_condition, &p_rwlock->lock);
    pthread_cleanup_pop(0);
    return result;
}

[[gnu::noinline]] int wait_to_write(rg_i_read_write_lock_t * p_rwlock)
{
    volatile int result = 0;
    pthread_cleanup_push(decrement_writers_if_thread_cancelled, p_rwlock);
    while (result == 0 && p_rwlock->lock_count != 0)
        result = pthread_cond_wait(&p_rwlock->write_condition, &p_rwlock->lock);
    pthread_cleanup_pop(0);
    return result;
}

} // namespace

void rg_i_rw_open(rg_i_read_write_lock_t * p_rwlock)
{
    std::memset(p_rwlock, 0, sizeof *p_rwlock);
    pthread_mutex_init(&p_rwlock->lock, nullptr);
    pthread_cond_init(&p_rwlock->read_condition, nullptr);
    pthread_cond_init(&p_rwlock->write_condition, nullptr);
}

void rg_i_rw_close(rg_i_read_write_lock_t * p_rwlock)
{
    pthread_mutex_destroy(&p_rwlock->lock);
    pthread_cond_destroy(&p_rwlock->write_condition);
    pthread_cond_destroy(&p_rwlock->read_condition);
}

kt_int32_t rg_i_rw_lock_read(rg_i_read_write_lock_t * p_rwlock)
{
    if (const int result = pthread_mutex_lock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_lock", result);

    ++p_rwlock->waiting_readers;
    if (p_rwlock->lock_count < 0) {
        if (const int result = wait_to_read(p_rwlock); result != 0) {
            --p_rwlock->waiting_readers;
            pthread_mutex_unlock(&p_rwlock->lock);
            return rg_i_fail_system_call(RG_HERE, "pthread_cond_wait", result);
        }
    }
    ++p_rwlock->lock_count;
    --p_rwlock->waiting_readers;
    if (const int result = pthread_mutex_unlock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_unlock", result);
    return 0;
}

kt_int32_t rg_i_rw_unlock_read(rg_i_read_write_lock_t * p_rwlock)
{
    if (const int result = pthread_mutex_lock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_lock", result);

    if (--p_rwlock->lock_count == 0) {
        // Whether or not a writer waits: nothing counts the waiting writers.
        if (const int result = pthread_cond_signal(&p_rwlock->write_condition); result != 0) {
            ++p_rwlock->lock_count;
            pthread_mutex_unlock(&p_rwlock->lock);
            return rg_i_fail_system_call(RG_HERE, "pthread_cond_signal", result);
        }
    }
    if (const int result = pthread_mutex_unlock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_unlock", result);
    return 0;
}

kt_int32_t rg_i_rw_lock_write(rg_i_read_write_lock_t * p_rwlock)
{
    if (const int result = pthread_mutex_lock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_lock", result);

    // Kept because callers depend on it: waiting_writers is not taken down on success, so it grows with every write
    // lock. It is no count of waiters, and no decision may read it.
    add_wrapping(p_rwlock->waiting_writers, 1);
    if (p_rwlock->lock_count != 0) {
        if (const int result = wait_to_write(p_rwlock); result != 0) {
            // Kept because callers depend on it: the count goes down behind the unlock here, not ahead of it.
            pthread_mutex_unlock(&p_rwlock->lock);
            add_wrapping(p_rwlock->waiting_writers, one_less);
            return rg_i_fail_system_call(RG_HERE, "pthread_cond_wait", result);
        }
    }
    p_rwlock->lock_count = -1;
    if (const int result = pthread_mutex_unlock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_unlock", result);
    return 0;
}

kt_int32_t rg_i_rw_unlock_write(rg_i_read_write_lock_t * p_rwlock)
{
    if (const int result = pthread_mutex_lock(&p_rwlock->lock); result != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_lock", result);

    const kt_int32_t original_lock_count = p_rwlock->lock_count;
    const bool       readers_wait        = p_rwlock->waiting_readers != 0;
    p_rwlock->lock_count                 = 0;

    // All waiting readers go ahead of any writer.
    const int result = readers_wait ? pthread_cond_broadcast(&p_rwlock->read_condition)
                                    : pthread_cond_signal(&p_rwlock->write_condition);
    if (result != 0) {
        p_rwlock->lock_count = original_lock_count;
        pthread_mutex_unlock(&p_rwlock->lock);
        return rg_i_fail_system_call(RG_HERE, readers_wait ? "pthread_cond_broadcast" : "pthread_cond_signal", result);
    }
    if (const int unlocked = pthread_mutex_unlock(&p_rwlock->lock); unlocked != 0)
        return rg_i_fail_system_call(RG_HERE, "pthread_mutex_unlock", unlocked);
    return 0;
}
