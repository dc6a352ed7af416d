// SPDX-License-Identifier: MIT
// workloads: what is measured, by name.
#ifndef PEERS_WORKLOADS_H
#define PEERS_WORKLOADS_H

#include <span>
#include <string>
#include <string_view>

#include "common/text.h"

namespace peers
{

using namespace bench;

struct workload {
    const char * name;
    unit         in;
    const char * per; // what one figure is the cost of
    const char * meaning;
};

// Those of the stores, in the order in which they are reported.
std::span<const workload> workloads();
// What the machine itself can do; measured in the same run.
std::span<const workload> machine_limits();

} // namespace peers

#endif
