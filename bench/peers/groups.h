// SPDX-License-Identifier: MIT
// groups: workloads that share a data set, and so are measured one after the other.
#ifndef PEERS_GROUPS_H
#define PEERS_GROUPS_H

#include "arena.h"

namespace peers
{

void run_batches(arena & a); // transactions of many rows, on fresh stores
void run_durable(arena & a); // transactions of one row
void run_by_id(arena & a);   // reads, scans, opening, on one load
void run_by_name(arena & a);
void run_columns(arena & a); // a column added and dropped
void run_updated(arena & a); // what is on disk after many updates

void run_machine_limits(arena & a);

} // namespace peers

#endif
