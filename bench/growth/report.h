// SPDX-License-Identifier: MIT
// report: a run's figures as a table for the terminal, as CSV, as Markdown, and as charts.
#ifndef GROWTH_REPORT_H
#define GROWTH_REPORT_H

#include <string>

#include "figures.h"

namespace growth
{

void print_table(const figures & all);
void write_csv(const figures & all, const std::string & path);
void write_markdown(const figures & all, const std::string & path, const std::string & command);
void write_charts(const figures & all, const std::string & directory);

} // namespace growth

#endif
