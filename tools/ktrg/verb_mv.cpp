// SPDX-License-Identifier: MIT
// ktrg mv: gives a table another name, or another directory.
//
// The source is held open for writing meanwhile, so that no other process writes to a file that goes away under it. On
// one file system its file is renamed. To another one it is copied and then removed: a kill in between leaves both.
#include <fmt/format.h>
#include <sys/stat.h>

#include "interrupt.h"
#include "whole_table.h"

namespace ktrg
{

namespace
{

bool on_one_file_system(const place & source, const place & target)
{
    struct stat one {
    };
    struct stat other {
    };
    return stat(source.file.c_str(), &one) == 0 && stat(target.directory.c_str(), &other) == 0 &&
           one.st_dev == other.st_dev;
}

} // namespace

exit_code run_mv(const common_options & common, const copy_options & options)
{
    const place source = find_place(options.source);
    const place target = find_target(options.target, source.file_name);
    note_interrupts();
    table from = table::open_for_writing(source, common.wait_seconds);
    refuse_same_file(source, target);
    check_directory(source);
    const bool replaces = check_target(common, target);
    stop_if_interrupted();
    if (!common.dry_run && on_one_file_system(source, target)) {
        rename_table(source, target, common.force);
    } else if (!common.dry_run) {
        copy_table(from, target, common.force);
        from.drop();
    }
    if (!common.quiet)
        say(fmt::format("{}: {} {} {}", source.name, common.dry_run ? "would be moved" : "moved",
                        replaces ? "over" : "to", target.name));
    return exit_code::done;
}

} // namespace ktrg
