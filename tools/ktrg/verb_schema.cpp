// SPDX-License-Identifier: MIT
// ktrg schema: the columns of a table, as the text that makes them again, or as JSON.
#include <algorithm>

#include "place.h"
#include "registry.h"
#include "schema_output.h"
#include "table_file.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// The file tells the columns at no cost, and also of a table that doesn't open any more. Only a default that is stored
// as an array, a structure or bytes takes the library to read.
std::vector<column> columns_at(const place & where)
{
    std::vector<column> columns = read_table_columns(where.file, where.name);
    const bool          plain   = std::all_of(columns.begin(), columns.end(), [](const column & each) {
        return !is_indirect(each.type) || each.type == KT_CHAR_PTR || each.type == KT_RSRC_HANDLE_PTR;
    });
    return plain ? columns : table::open_for_reading(where).columns();
}

} // namespace

exit_code run_schema(const common_options & common, const table_options & options)
{
    const place where = find_place(options.table);
    write_schema(common, where, columns_at(where));
    return exit_code::done;
}

} // namespace ktrg
