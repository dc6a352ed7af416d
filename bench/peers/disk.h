// SPDX-License-Identifier: MIT
#ifndef PEERS_DISK_H
#define PEERS_DISK_H

#include "groups.h"

namespace peers
{

// What the loaded stores take on the disk; they are closed.
void measure_disk(arena & a, const char * p_workload);

} // namespace peers

#endif
