// SPDX-License-Identifier: MIT
// tree: a tree of the library, with directories mounted in it, that closes itself.
#pragma once

#include <string>
#include <utility>

#include "kt_rg.h"
#include "place.h"

namespace ktrg
{

// The library's parameters are not const, though it changes none of them.
[[nodiscard]] inline kt_char_ptr_t writable(const std::string & text)
{
    return const_cast<kt_char_ptr_t>(text.c_str());
}

// Throws the failure for a code that isn't 0, with the place as its subject.
void check(kt_int32_t code, const place & where, std::string_view context = {});

class tree
{
  public:
    tree() = default; // none yet
    explicit tree(const place & where);
    tree(tree && other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}
    tree & operator=(tree && other) noexcept
    {
        std::swap(handle_, other.handle_);
        return *this;
    }
    ~tree() { close(); }

    // Mounts the place's directory. One that isn't there is told, and not made.
    void mount(const place & where, const std::string & at = mount_point) const;
    void close();

    [[nodiscard]] rg_opaque_handle_t handle() const { return handle_; }

  private:
    rg_opaque_handle_t handle_ = nullptr;
};

} // namespace ktrg
