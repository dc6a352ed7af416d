// SPDX-License-Identifier: MIT
// ktrg get: rows by their keys, in the order of the keys.
#include <fmt/format.h>

#include "place.h"
#include "registry.h"
#include "row_output.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

kt_value_t parse_key(const place & where, const column & key, const std::string & text, value_arena & arena)
{
    try {
        return parse_value(key.type, key.fields, text, arena);
    } catch (const failure & what) {
        throw failure(what.exit(), where.name, fmt::format("the key \"{}\": {}", key.name, what.text()));
    }
}

} // namespace

exit_code run_get(const common_options & common, const get_options & options)
{
    // Beyond a few keys an index of all keys costs less than a search for each.
    constexpr std::size_t few    = 4;
    const place           where  = find_place(options.table);
    const table           opened = table::open_for_reading(where, options.keys.size() > few);
    row_values            values(chosen_columns(opened, options.columns));

    value_arena             arena;
    std::vector<kt_value_t> keys; // all are understood before the first row is shown
    for (const std::string & text : options.keys)
        keys.push_back(parse_key(where, opened.columns().front(), text, arena));

    output_sink sink;
    row_output  rows(common.style_or(output_form::table), values.columns(), sink);
    for (std::size_t i = 0; i < keys.size(); i++) {
        if (opened.read_by_key(keys[i], values))
            rows.write(values);
        else
            print_failure(failure(exit_code::plain_no, where.name,
                                  fmt::format("no row with the key {}", in_quotes(options.keys[i])), RG_E_NO_SUCH_KEY),
                          common.errors);
    }
    rows.end();
    return rows.count() != 0 ? exit_code::done : exit_code::plain_no;
}

} // namespace ktrg
