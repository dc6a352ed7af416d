// SPDX-License-Identifier: MIT
// ktrg create: a new, empty table.
#include <fmt/format.h>

#include "place.h"
#include "registry.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// The columns with the key in front, where the registry keeps it.
std::vector<column> columns_of(const create_options & options, const place & where)
{
    std::vector<column> columns;
    for (const std::string & text : options.columns) {
        column each = parse_column(text);
        for (const column & other : columns)
            if (other.name == each.name)
                throw failure(exit_code::usage, where.name, fmt::format("two columns have the name \"{}\"", each.name),
                              RG_E_DUPLICATE_COLUMN);
        columns.insert(each.is_key() ? columns.begin() : columns.end(), std::move(each));
    }
    return columns;
}

} // namespace

exit_code run_create(const common_options & common, const create_options & options)
{
    const place               where   = find_place(options.table);
    const std::vector<column> columns = columns_of(options, where);
    table made = common.dry_run ? table::create_in_memory(where, columns, 0) : table::create(where, columns, 0);
    made.close();
    if (!common.quiet)
        say(fmt::format("{}: {} with {} {}", where.name, common.dry_run ? "would be created" : "created",
                        columns.size(), columns.size() == 1 ? "column" : "columns"));
    return exit_code::done;
}

} // namespace ktrg
