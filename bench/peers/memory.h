// SPDX-License-Identifier: MIT
// memory: what a store takes of it, told by a process that does nothing else.
#ifndef PEERS_MEMORY_H
#define PEERS_MEMORY_H

#include "store.h"

namespace peers
{

struct memory_figures {
    double own;  // bytes that belong to the process alone and can't be dropped
    double peak; // most bytes resident, mapped files included; beyond those at the start
};

// Starts this program again, to open the store and to read it all.
memory_figures memory_of_child(const char * p_store, const place & where);

// What it does then. Writes the figures to standard output.
void be_the_child(const std::string & store, const place & where);

} // namespace peers

#endif
