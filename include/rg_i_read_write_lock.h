// SPDX-License-Identifier: MIT
// rg_i_read_write_lock: the lock that each tree and each table has, for the threads of one process.
//
// Readers go ahead of waiting writers. Not recursive, no upgrade, no owner. The mutex guards the three counts and is
// held inside the operations only. Every operation returns 0 or RG_E_SYSTEM_CALL with its record.
#pragma once

#include <pthread.h>

#include "kt_types.h"

struct rg_i_read_write_lock_t {
    pthread_mutex_t lock;            // guards the three counts
    pthread_cond_t  read_condition;  // readers wait here
    pthread_cond_t  write_condition; // writers wait here
    kt_int32_t      lock_count;      // read holders; 0 free; -1 held for writing
    kt_int32_t      waiting_readers; // readers between entry and acquisition
    kt_int32_t      waiting_writers; // writers that have entered; grows with every write lock, and nothing may read it
};

void rg_i_rw_open(rg_i_read_write_lock_t * p_rwlock);
void rg_i_rw_close(rg_i_read_write_lock_t * p_rwlock);

[[nodiscard]] kt_int32_t rg_i_rw_lock_read(rg_i_read_write_lock_t * p_rwlock);
kt_int32_t               rg_i_rw_unlock_read(rg_i_read_write_lock_t * p_rwlock);
[[nodiscard]] kt_int32_t rg_i_rw_lock_write(rg_i_read_write_lock_t * p_rwlock);
kt_int32_t               rg_i_rw_unlock_write(rg_i_read_write_lock_t * p_rwlock);
