// SPDX-License-Identifier: MIT
// whole_table: putting a whole table at a place, as cp, mv, unpack and alter do.
//
// The library prepares the file beside the target and renames it, so that a reader finds the old target or the new one.
#pragma once

#include "registry.h"
#include "verbs.h"

namespace ktrg
{

// The place that the user names as a target: a table, or a directory for one with that file name.
[[nodiscard]] place find_target(const std::string & target, const std::string & file_name);

// Refuses a target that can't be had: one that exists, without --force; one that another process holds; one in a
// directory that isn't there or may not be written. True if there is a table that is to be replaced.
bool check_target(const common_options & common, const place & target);

// Refuses a directory in which no file can be made or removed.
void check_directory(const place & where);

// Refuses a target that is the source itself, by whatever path.
void refuse_same_file(const place & source, const place & target);

// Writes the open table to the place.
void copy_table(table & from, const place & to, bool overwrite);

// Renames the table's file. Both places are in one file system. The caller has the table open for writing, in another
// tree, so that nobody else has.
void rename_table(const place & from, const place & to, bool overwrite);

} // namespace ktrg
