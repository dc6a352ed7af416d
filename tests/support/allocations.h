// SPDX-License-Identifier: MIT
// allocations: running out of memory at every place in turn.
#pragma once

#include <gtest/gtest.h>

#include <functional>

#include "kt_rg.h"
#include "support/faults.h"
#include "support/registry.h"

namespace kt_test
{

// Makes the first allocation of `attempt` fail, then the second and so on, until it succeeds. Each failure must be
// RG_E_NO_MEMORY with its record. `after` runs behind each attempt, with memory again, and gets the attempt's code.
inline void fail_each_allocation(
    const std::function<kt_int32_t()> & attempt, const std::function<void(kt_int32_t)> & after = [](kt_int32_t) {})
{
    for (unsigned nth = 1; nth < 1000; ++nth) {
        fault_scope faults;
        ku_set_no_error_1();
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc     = attempt();
        const bool       failed = failed_as_asked(call::allocation);
        reset_calls();
        if (failed) {
            EXPECT_EQ(rc, RG_E_NO_MEMORY) << "allocation " << nth;
            EXPECT_EQ(error_code(), RG_E_NO_MEMORY) << "allocation " << nth;
        } else {
            EXPECT_EQ(rc, 0) << error_text();
        }
        after(rc);
        if (!failed) {
            EXPECT_GT(nth, 1u) << "nothing was allocated, so nothing was tested";
            return;
        }
    }
    ADD_FAILURE() << "the attempt never succeeds";
}

} // namespace kt_test
