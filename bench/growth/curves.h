// SPDX-License-Identifier: MIT
// curves: what is measured, by name, and what each curve may cost by its definition.
#ifndef GROWTH_CURVES_H
#define GROWTH_CURVES_H

#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "common/clock.h"

namespace growth
{

using namespace bench;

// Curves of one family share a chart.
enum class family { reads, changes, calls, rows, columns, files, transactions, machine };

// What a table has gone through before it is measured.
enum class state { fresh, churned, versions, reopened };

std::string_view name_of(state s);
std::string_view title_of(family f);

struct curve {
    const char * name;
    family       in;
    const char * per;       // what a figure is the cost of
    const char * functions; // the exported functions that it stands for, with blanks between
    clock_kind   clock;
    double accesses;  // to random places in memory that its definition makes it take at most, for one of what it is per
    const char * why; // which these are, or what else makes it grow
    bool         defined_growth = false; // it grows whatever the caches do, for the reason that why tells
};

std::span<const curve> curves();
// Throws if there is none.
const curve & curve_of(std::string_view name);

// Throws unless the curves name every exported function, and no other.
void check_names();

} // namespace growth

#endif
