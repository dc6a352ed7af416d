// SPDX-License-Identifier: MIT
#ifndef PEERS_READS_H
#define PEERS_READS_H

#include "groups.h"

namespace peers
{

// On stores that were loaded by id, and are open.
void measure_reads_by_id(arena & a);
void measure_reads_by_two(arena & a); // threads

} // namespace peers

#endif
