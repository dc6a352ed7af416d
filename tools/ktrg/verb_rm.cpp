// SPDX-License-Identifier: MIT
// ktrg rm: deletes rows by their keys, by an expression, or all of them; in one transaction.
#include <algorithm>
#include <map>

#include <fmt/format.h>

#include "interrupt.h"
#include "place.h"
#include "registry.h"
#include "values.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// Equal keys have equal texts: both zeros are one.
std::string canonical_text(const column & key, const kt_value_t & value)
{
    std::string text = cell_of(key, value, value_style{}).text;
    return text == "-0.0" ? "0.0" : text;
}

// The keys that are wanted, by their canonical text, with the number of rows found for each.
std::map<std::string, std::size_t> wanted_keys(const table & from, const std::vector<std::string> & texts)
{
    const column &                     key = from.columns().front();
    value_arena                        arena;
    std::map<std::string, std::size_t> wanted;
    for (const std::string & text : texts) {
        try {
            wanted[canonical_text(key, parse_value(key.type, key.fields, text, arena))] = 0;
        } catch (const failure & what) {
            throw failure(what.exit(), from.where().name, fmt::format("the key \"{}\": {}", key.name, what.text()));
        }
    }
    return wanted;
}

// Goes through all rows once, so that each row with a key that several have is found.
std::size_t delete_by_keys(const common_options & common, const table & from, const std::vector<std::string> & texts)
{
    std::map<std::string, std::size_t> wanted = wanted_keys(from, texts);
    const column                       key    = from.columns().front();
    row_values                         values({key});
    std::size_t                        deleted = 0;
    for (std::uint64_t position = 0; from.read(position, values); position++) {
        stop_if_interrupted();
        const auto found = wanted.find(canonical_text(key, values[0]));
        if (found == wanted.end())
            continue;
        from.delete_at(position);
        found->second++;
        deleted++;
    }
    for (const auto & [text, count] : wanted)
        if (count == 0)
            print_failure(failure(exit_code::plain_no, from.where().name,
                                  fmt::format("no row with the key {}", in_quotes(text)), RG_E_NO_SUCH_KEY),
                          common.errors);
    return deleted;
}

std::size_t delete_all(const table & from)
{
    if (from.count() != 0)
        from.delete_all();
    return from.count();
}

std::size_t delete_rows(const common_options & common, const table & from, const rm_options & options)
{
    if (options.all)
        return delete_all(from);
    if (options.where.has_value())
        return from.delete_matching(*options.where);
    return delete_by_keys(common, from, options.keys);
}

void refuse_wrong_options(const common_options & common, const rm_options & options, const place & where)
{
    const int ways = (options.all ? 1 : 0) + (options.where.has_value() ? 1 : 0) + (options.keys.empty() ? 0 : 1);
    if (ways != 1)
        throw failure(exit_code::usage, where.name, "rm wants keys, or --where EXPR, or --all");
    if (options.all && !common.force)
        throw failure(exit_code::usage, where.name, "--all deletes every row; --force says that this is meant");
}

} // namespace

exit_code run_rm(const common_options & common, const rm_options & options)
{
    const place where = find_place(options.table);
    refuse_wrong_options(common, options, where);
    note_interrupts();
    table             from    = table::open_for_writing(where, common.wait_seconds);
    const std::size_t deleted = delete_rows(common, from, options);
    if (deleted != 0)
        from.finish(common.dry_run);
    if (!common.quiet)
        say(fmt::format("{}: {} {} {} deleted", where.name, deleted, deleted == 1 ? "row" : "rows",
                        common.dry_run ? "would be"
                        : deleted == 1 ? "was"
                                       : "were"));
    return deleted != 0 ? exit_code::done : exit_code::plain_no;
}

} // namespace ktrg
