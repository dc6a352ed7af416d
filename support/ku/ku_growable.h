// SPDX-License-Identifier: MIT
// ku_growable: an array that grows and says when it can't. Internal to the utility library.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <type_traits>

// Elements move with realloc, so they are plain records. Addresses are good until the next growth.
template <class T> class ku_growable
{
    static_assert(std::is_trivially_copyable_v<T>);

  public:
    ku_growable() = default;
    ~ku_growable() { std::free(p_); }
    ku_growable(const ku_growable &)             = delete;
    ku_growable & operator=(const ku_growable &) = delete;

    // Room for so many more elements behind the present ones; their content is arbitrary. NULL: no memory.
    [[nodiscard]] T * add(size_t more)
    {
        if (count_ + more > room_) {
            const size_t new_room = count_ + more + room_ / 2 + 16;
            T *          p_larger = static_cast<T *>(std::realloc(p_, new_room * sizeof(T)));
            if (p_larger == nullptr)
                return nullptr;
            p_    = p_larger;
            room_ = new_room;
        }
        T * p_new = p_ + count_;
        count_ += more;
        return p_new;
    }
    [[nodiscard]] bool push(const T & element)
    {
        T * p_new = add(1);
        if (p_new == nullptr)
            return false;
        *p_new = element;
        return true;
    }
    void      truncate(size_t count) { count_ = count; }
    size_t    count() const { return count_; }
    T *       data() { return p_; }
    const T * data() const { return p_; }
    T &       operator[](size_t i) { return p_[i]; }
    const T & operator[](size_t i) const { return p_[i]; }

  private:
    T *    p_     = nullptr;
    size_t count_ = 0;
    size_t room_  = 0;
};
