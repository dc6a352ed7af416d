// SPDX-License-Identifier: MIT
// ktrg alter: other columns for a table, in one step.
//
// The library changes columns call by call, each a commit of its own, and each leaves the blob out of the file. So all
// is done to a copy in a directory beside the table: the changes, then one commit with the blob and the counter. The
// copy is renamed over the table while that is held open for writing, so that no other process writes in between.
#include <fmt/format.h>

#include "column_changes.h"
#include "column_definitions.h"
#include "hold.h"
#include "interrupt.h"
#include "schema_output.h"
#include "staging.h"
#include "whole_table.h"

namespace ktrg
{

namespace
{

void change_columns(const table & changing, const column_changes & changes)
{
    const rg_opaque_handle_t handle = changing.handle();
    const place &            where  = changing.where();
    if (!changes.drop.empty()) {
        std::vector<kt_char_ptr_t> names;
        for (const std::string & name : changes.drop)
            names.push_back(writable(name));
        check(rg_delete_columns_1(handle, names.data(), static_cast<kt_uint32_t>(names.size())), where, "--drop");
    }
    column_definitions defaults(changes.defaults, where.name);
    for (std::size_t i = 0; i < changes.defaults.size(); i++)
        check(rg_change_default_value_1(handle, defaults[i].name, defaults[i].default_value), where, "--default");
    for (const auto & [name, new_name] : changes.rename)
        check(rg_change_column_name_1(handle, writable(name), writable(new_name)), where, "--rename");
    if (!changes.add.empty()) {
        column_definitions added(changes.add, where.name);
        check(rg_add_columns_1(handle, added.data(), added.count()), where, "--add");
    }
}

// What was made is looked at once more before it replaces anything.
void compare(const table & made, const table & from, const column_changes & changes)
{
    bool same = made.count() == from.count() && made.columns().size() == changes.result.size();
    for (std::size_t i = 0; same && i < changes.result.size(); i++)
        same = made.columns()[i].name == changes.result[i].name && made.columns()[i].type == changes.result[i].type;
    if (!same)
        throw failure(exit_code::internal, from.where().name,
                      "the changed copy isn't what it should be; the table is as it was", RG_E_INTERNAL);
}

void make_changed_copy(table & from, const column_changes & changes, const place & copy)
{
    copy_table(from, copy, false);
    change_columns(table::open_for_writing(copy, 0), changes);
    // Opened anew: behind a change of columns a commit of the same handle would go to a wrong place in the file.
    table made = table::open_for_writing(copy, 0);
    compare(made, from, changes);
    if (const auto blob = from.blob(); blob.has_value())
        made.set_blob(*blob);
    made.commit(from.counter() + 1);
}

std::string summary(const column_changes & changes, std::size_t renamed)
{
    std::vector<std::string> parts;
    if (!changes.add.empty())
        parts.push_back(fmt::format("{} added", counted(changes.add.size(), "column")));
    if (!changes.drop.empty())
        parts.push_back(fmt::format("{} dropped", counted(changes.drop.size(), "column")));
    if (renamed != 0)
        parts.push_back(fmt::format("{} renamed", counted(renamed, "column")));
    if (!changes.defaults.empty())
        parts.push_back(fmt::format("{} changed", counted(changes.defaults.size(), "default")));
    return fmt::format("{}", fmt::join(parts, ", "));
}

} // namespace

exit_code run_alter(const common_options & common, const alter_options & options)
{
    const place where = find_place(options.table);
    note_interrupts();
    table                from    = table::open_for_writing(where, common.wait_seconds);
    const column_changes changes = changes_for(options, from.columns(), where.name);
    check_directory(where);
    if (common.dry_run) {
        write_schema(common, where, changes.result);
        return exit_code::done;
    }
    const staging stage(where);
    make_changed_copy(from, changes, stage.place_for(where));
    stop_if_interrupted();
    wait_for_directory(where, common.wait_seconds);
    rename_table(stage.place_for(where), where, true);
    from.close();
    if (!common.quiet)
        say(fmt::format("{}: {} ({})", where.name, summary(changes, options.rename.size()),
                        counted(from.count(), "row")));
    return exit_code::done;
}

} // namespace ktrg
