// SPDX-License-Identifier: MIT
// groups: what is measured on one table, one group behind the other.
#ifndef GROWTH_GROUPS_H
#define GROWTH_GROUPS_H

#include "run.h"
#include "tables.h"

namespace growth
{

// These leave the table as it was.
void measure_reads(run & r, table_in_memory & t);
void measure_calls(run & r, table_in_memory & t);
void measure_settings(run & r, table_in_memory & t); // fields set, and aborted
void measure_rows(run & r, table_in_memory & t);
void measure_packed(run & r, table_in_memory & t);
void measure_columns(run & r, table_in_memory & t); // on copies
// And this one doesn't.
void measure_transactions(run & r, table_in_memory & t);

// On a table without a hash table.
void measure_without_hash(run & r, table_in_memory & t);

// On tables in a directory below the one that was chosen.
void measure_files(run & r);

void measure_machine(run & r);

} // namespace growth

#endif
