// SPDX-License-Identifier: MIT
// rg_i_guards: what releases what was acquired when a scope is left. None allocates; a guard releases only where a
// failure of the release means nothing to the caller.
//
// Never rely on a guard across a cancellation point: the library is built without exceptions, so that a thread that is
// cancelled inside an updating call leaves its locks held, and destructors don't run.
#pragma once

#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <utility>

#include "rg_i_read_write_lock.h"
#include "rg_i_record_buffer_pool.h"

// code() is the result of the lock. Unlocks only what it locked.
class mutex_guard
{
  public:
    explicit mutex_guard(pthread_mutex_t & mutex) : mutex_(mutex), code_(pthread_mutex_lock(&mutex)) {}
    ~mutex_guard()
    {
        if (code_ == 0)
            pthread_mutex_unlock(&mutex_);
    }
    mutex_guard(const mutex_guard &)                 = delete;
    mutex_guard &     operator=(const mutex_guard &) = delete;
    [[nodiscard]] int code() const { return code_; }

  private:
    pthread_mutex_t & mutex_;
    const int         code_;
};

// The read-write lock can fail to lock: look at code() first. Unlocks only what it locked.
class read_guard
{
  public:
    explicit read_guard(rg_i_read_write_lock_t & lock) : lock_(lock), code_(rg_i_rw_lock_read(&lock)) {}
    ~read_guard()
    {
        if (code_ == 0)
            rg_i_rw_unlock_read(&lock_);
    }
    read_guard(const read_guard &)                         = delete;
    read_guard &             operator=(const read_guard &) = delete;
    [[nodiscard]] kt_int32_t code() const { return code_; }

  private:
    rg_i_read_write_lock_t & lock_;
    const kt_int32_t         code_;
};

class write_guard
{
  public:
    explicit write_guard(rg_i_read_write_lock_t & lock) : lock_(lock), code_(rg_i_rw_lock_write(&lock)) {}
    ~write_guard()
    {
        if (code_ == 0)
            rg_i_rw_unlock_write(&lock_);
    }
    write_guard(const write_guard &)                        = delete;
    write_guard &            operator=(const write_guard &) = delete;
    [[nodiscard]] kt_int32_t code() const { return code_; }

  private:
    rg_i_read_write_lock_t & lock_;
    const kt_int32_t         code_;
};

// A descriptor, closed once; errno survives the close.
class unique_fd
{
  public:
    explicit unique_fd(int fd = -1) : fd_(fd) {}
    ~unique_fd() { reset(); }
    unique_fd(unique_fd && other) noexcept : fd_(other.release()) {}
    unique_fd & operator=(unique_fd && other) noexcept
    {
        reset(other.release());
        return *this;
    }
    [[nodiscard]] int get() const { return fd_; }
    [[nodiscard]] int release() { return std::exchange(fd_, -1); }
    void              reset(int fd = -1)
    {
        if (fd_ >= 0) {
            const int saved = errno;
            close(fd_);
            errno = saved;
        }
        fd_ = fd;
    }

  private:
    int fd_;
};

// A block from malloc, freed unless released.
template <class T> class owned_ptr
{
  public:
    explicit owned_ptr(T * p = nullptr) : p_(p) {}
    ~owned_ptr() { std::free(p_); }
    owned_ptr(owned_ptr && other) noexcept : p_(other.release()) {}
    owned_ptr & operator=(owned_ptr && other) noexcept
    {
        reset(other.release());
        return *this;
    }
    [[nodiscard]] T * get() const { return p_; }
    T *               operator->() const { return p_; }
    explicit          operator bool() const { return p_ != nullptr; }
    [[nodiscard]] T * release() { return std::exchange(p_, nullptr); }
    void              reset(T * p = nullptr)
    {
        if (p != p_)
            std::free(p_);
        p_ = p;
    }
    // For functions that deliver an allocation through a pointer. Only while it owns nothing.
    [[nodiscard]] T ** out() { return &p_; }

  private:
    T * p_;
};
using owned_buffer = owned_ptr<char>;

// Runs an action when the scope is left, unless dismissed.
template <class Action> class rollback
{
  public:
    explicit rollback(Action action) : action_(action) {}
    ~rollback()
    {
        if (armed_)
            action_();
    }
    rollback(const rollback &)             = delete;
    rollback & operator=(const rollback &) = delete;
    void       dismiss() { armed_ = false; }

  private:
    Action action_;
    bool   armed_ = true;
};

// Records that are freed in the scope go together at its end.
class gathered_frees
{
  public:
    gathered_frees(rg_i_record_buffer_pool_t & pool, kt_uint32_t expected) : pool_(pool)
    {
        rg_i_rb_gather_frees(&pool_, expected);
    }
    ~gathered_frees() { rg_i_rb_free_gathered(&pool_); }
    gathered_frees(const gathered_frees &)             = delete;
    gathered_frees & operator=(const gathered_frees &) = delete;

  private:
    rg_i_record_buffer_pool_t & pool_;
};
