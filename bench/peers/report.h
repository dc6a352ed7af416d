// SPDX-License-Identifier: MIT
// report: a run's figures as a table for the terminal, as CSV and as Markdown.
#ifndef PEERS_REPORT_H
#define PEERS_REPORT_H

#include <string>

#include "results.h"

namespace peers
{

void print_table(const results & figures);
void write_csv(const results & figures, const std::string & path);
void write_markdown(const results & figures, const std::string & path);

} // namespace peers

#endif
