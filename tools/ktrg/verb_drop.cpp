// SPDX-License-Identifier: MIT
// ktrg drop: removes whole tables.
//
// All of them are looked at before the first goes. Each is held open for writing while it goes, so that no other process
// writes to a file without a name; one that is damaged can't be held, and goes without.
#include <fmt/format.h>

#include "hold.h"
#include "interrupt.h"
#include "table_file.h"
#include "whole_table.h"

namespace ktrg
{

namespace
{

// Checks that the table can be dropped. What is no table at all is left to rm.
void look_at(const common_options & common, const place & where)
{
    wait_while_held(where, common.wait_seconds);
    if (!looks_like_table(where.file))
        throw failure(exit_code::damaged, where.name,
                      "not a table, or damaged at its head: drop leaves it alone, and rm removes it",
                      RG_E_TABLE_UNREADABLE);
    check_directory(where);
}

const char * done_word(const common_options & common)
{
    return common.dry_run ? "would be dropped" : "dropped";
}

void drop_damaged(const common_options & common, const place & where)
{
    if (!common.dry_run) {
        const tree its(where);
        its.mount(where);
        check(rg_delete_table_1(its.handle(), writable(where.registry_path)), where);
    }
    if (!common.quiet)
        say(fmt::format("{}: {} (it is damaged)", where.name, done_word(common)));
}

void drop(const common_options & common, const place & where)
{
    try {
        table      it   = table::open_for_writing(where, common.wait_seconds);
        const auto rows = it.count();
        if (!common.dry_run)
            it.drop();
        if (!common.quiet)
            say(fmt::format("{}: {} ({})", where.name, done_word(common), counted(rows, "row")));
    } catch (const failure & what) {
        // A counter that is demanded can't be told of a damaged table.
        if (what.exit() != exit_code::damaged || where.counter.has_value())
            throw;
        drop_damaged(common, where);
    }
}

} // namespace

exit_code run_drop(const common_options & common, const tables_options & options)
{
    std::vector<place> places;
    for (const std::string & name : options.tables) {
        place where = find_place(name);
        for (const place & other : places)
            if (other.file == where.file)
                throw failure(exit_code::usage, where.name, "named twice");
        places.push_back(std::move(where));
    }
    if (!common.force)
        throw failure(exit_code::usage, places.front().name,
                      "drop removes the table with all its rows; --force says that this is meant");
    note_interrupts();
    for (const place & where : places)
        look_at(common, where);
    std::size_t dropped = 0;
    for (const place & where : places) {
        try {
            stop_if_interrupted();
            drop(common, where);
            dropped++;
        } catch (const failure & what) {
            if (dropped == 0)
                throw;
            print_failure(what, common.errors);
            return exit_code::done_in_part;
        }
    }
    return exit_code::done;
}

} // namespace ktrg
