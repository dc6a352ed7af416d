// SPDX-License-Identifier: MIT
// rg_i_large_pages: asks the system to back a large allocation with large pages.
//
// An index of a million slots is read and filled in strides that leave a page after a few dozen slots: with small pages
// the faults of its first use and the misses of the address cache cost more than the memory itself. It is advice: where
// the system has no large pages, or none left, nothing is different.
#pragma once

#include <sys/mman.h>

#include <cstddef>
#include <cstdint>

inline constexpr std::size_t rg_i_large_page = std::size_t{2} << 20;

inline void rg_i_prefer_large_pages([[maybe_unused]] void * p, [[maybe_unused]] std::size_t length)
{
#ifdef MADV_HUGEPAGE
    const std::uintptr_t first = (reinterpret_cast<std::uintptr_t>(p) + rg_i_large_page - 1) & ~(rg_i_large_page - 1);
    const std::uintptr_t end   = (reinterpret_cast<std::uintptr_t>(p) + length) & ~(rg_i_large_page - 1);
    if (end > first)
        madvise(reinterpret_cast<void *>(first), end - first, MADV_HUGEPAGE);
#endif
}
