// SPDX-License-Identifier: MIT
// ktrg put: adds a row, or updates the one that has the key.
#include <fmt/format.h>

#include "place.h"
#include "registry.h"
#include "values.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// The columns that the user gives a value, and the values.
struct assignments {
    std::vector<kt_char_ptr_t>  names;
    std::vector<kt_value_t>     values;
    std::vector<std::string>    texts;
    std::vector<const column *> columns;
    value_arena                 arena;
    std::size_t                 key = SIZE_MAX; // position of the key among them

    // As the library takes them, with or without the key.
    void arrays(bool with_key, std::vector<kt_char_ptr_t> & some_names, std::vector<kt_value_t *> & addresses)
    {
        for (std::size_t i = 0; i < names.size(); i++) {
            if (i == key && !with_key)
                continue;
            some_names.push_back(names[i]);
            addresses.push_back(&values[i]);
        }
    }
};

void parse_assignment(const std::string & text, const table & to, assignments & result)
{
    const std::size_t equals = text.find('=');
    if (equals == std::string::npos || equals == 0)
        throw failure(exit_code::usage, to.where().name, fmt::format("a value is COL=VAL, not {}", in_quotes(text)));
    const column & of = to.columns()[find_column(to.columns(), text.substr(0, equals), to.where().name)];
    for (const column * p_other : result.columns)
        if (p_other == &of)
            throw failure(exit_code::usage, to.where().name, fmt::format("column \"{}\" is given twice", of.name),
                          RG_E_DUPLICATE_COLUMN);
    if (of.is_key())
        result.key = result.names.size();
    try {
        result.values.push_back(parse_value(of.type, of.fields, text.substr(equals + 1), result.arena));
    } catch (const failure & what) {
        throw failure(what.exit(), to.where().name, fmt::format("column \"{}\": {}", of.name, what.text()));
    }
    result.names.push_back(const_cast<kt_char_ptr_t>(of.name.c_str()));
    result.texts.push_back(text.substr(equals + 1));
    result.columns.push_back(&of);
}

void insert(const table & to, assignments & given)
{
    std::vector<kt_char_ptr_t> names;
    std::vector<kt_value_t *>  addresses;
    given.arrays(true, names, addresses);
    if (const kt_int32_t code = to.add(names, addresses); code != 0)
        throw registry_failure(code, to.where().name);
}

void update(const table & to, assignments & given)
{
    for (const column * p_column : given.columns)
        if (!p_column->is_key() && (p_column->qualifier & RG_PROTECTED) != 0)
            throw protected_column(*p_column, to.where().name);
    std::vector<kt_char_ptr_t> names;
    std::vector<kt_value_t *>  addresses;
    given.arrays(false, names, addresses);
    if (const kt_int32_t code = to.set(given.values[given.key], names, addresses); code != 0)
        throw registry_failure(code, to.where().name);
}

} // namespace

exit_code run_put(const common_options & common, const put_options & options)
{
    const place where = find_place(options.table);
    table       to    = table::open_for_writing(where, common.wait_seconds);
    assignments given;
    for (const std::string & text : options.values)
        parse_assignment(text, to, given);
    if (given.key == SIZE_MAX)
        throw failure(exit_code::usage, where.name,
                      fmt::format("the key is missing: \"{}=...\"", to.columns().front().name), RG_E_KEY_EXPECTED);

    const std::string & key    = given.texts[given.key];
    const bool          exists = to.contains(given.values[given.key]);
    if (exists && options.insert)
        throw failure(exit_code::conflict, where.name, fmt::format("a row with the key {} exists", in_quotes(key)),
                      RG_E_DUPLICATE_KEY);
    if (!exists && options.update)
        throw failure(exit_code::plain_no, where.name, fmt::format("no row with the key {}", in_quotes(key)),
                      RG_E_NO_SUCH_KEY);
    if (exists)
        update(to, given);
    else
        insert(to, given);
    to.finish(common.dry_run);
    if (!common.quiet)
        say(fmt::format("{}: the row {} {} {}", where.name, in_quotes(key), common.dry_run ? "would be" : "was",
                        exists ? "updated" : "added"));
    return exit_code::done;
}

} // namespace ktrg
