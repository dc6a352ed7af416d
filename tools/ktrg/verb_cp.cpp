// SPDX-License-Identifier: MIT
// ktrg cp: copies a table, with its rows, its blob and its change counter.
//
// The source is opened for reading, so that what is damaged isn't copied, and what another process has not committed
// doesn't go along. The copy is written without the source's dead bytes.
#include <fmt/format.h>

#include "interrupt.h"
#include "whole_table.h"

namespace ktrg
{

exit_code run_cp(const common_options & common, const copy_options & options)
{
    const place source = find_place(options.source);
    const place target = find_target(options.target, source.file_name);
    note_interrupts();
    table from = table::open_for_reading(source);
    refuse_same_file(source, target);
    const bool replaces = check_target(common, target);
    stop_if_interrupted();
    if (!common.dry_run)
        copy_table(from, target, common.force);
    if (!common.quiet)
        say(fmt::format("{}: {} {} {} ({})", source.name, common.dry_run ? "would be copied" : "copied",
                        replaces ? "over" : "to", target.name, counted(from.count(), "row")));
    return exit_code::done;
}

} // namespace ktrg
