// SPDX-License-Identifier: MIT
// machine: what no table can beat at a size: an access to memory.
#include "common/machine.h"

#include "groups.h"

namespace growth
{

namespace
{

constexpr std::size_t bytes_a_row = 200; // record, slot, bucket, packed index

} // namespace

void measure_machine(run & r)
{
    memory_ring ring(bytes_a_row * r.rows());
    ring.nanoseconds_a_step(100'000);
    for (int i = 0; i < r.chosen().repeat; ++i)
        r.add("memory access", state::fresh, ring.nanoseconds_a_step(200'000));
}

} // namespace growth
