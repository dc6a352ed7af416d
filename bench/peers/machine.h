// SPDX-License-Identifier: MIT
#ifndef PEERS_MACHINE_H
#define PEERS_MACHINE_H

#include "groups.h"

namespace peers
{

// One repetition of the file limits.
void run_fsync_pairs(arena & a);

} // namespace peers

#endif
