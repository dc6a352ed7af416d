// SPDX-License-Identifier: MIT
#ifndef PEERS_CHARTS_H
#define PEERS_CHARTS_H

#include <string>

#include "results.h"

namespace peers
{

// Draws a chart of each workload that has figures at two sizes or more, named after it, in a directory.
void write_charts(const results & figures, const std::string & directory);

} // namespace peers

#endif
