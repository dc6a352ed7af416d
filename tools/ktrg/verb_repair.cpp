// SPDX-License-Identifier: MIT
// ktrg repair: removes rewrite files that nobody is writing any more.
//
// A process that rewrites or creates a table, or copies one, needs its rewrite file until the end. So nothing is
// touched that another process holds: the table, the rewrite file itself, or the lock file of the directory. All three
// are held here meanwhile.
#include <algorithm>
#include <cerrno>
#include <cstring>

#include <dirent.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include "hold.h"
#include "interrupt.h"
#include "staging.h"
#include "tree.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

constexpr std::string_view rewrite_suffix = ".rewrite";

bool is_file(const std::string & path, std::uint64_t * p_bytes = nullptr)
{
    struct stat status {
    };
    if (lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode))
        return false;
    if (p_bytes != nullptr)
        *p_bytes = static_cast<std::uint64_t>(status.st_size);
    return true;
}

// The tables of a directory that have a rewrite file, whether they are there or not.
std::vector<std::string> tables_to_repair(const std::string & directory)
{
    std::vector<std::string> names;
    for (const std::string & file : files_in(directory)) {
        const std::string name = file.substr(0, file.size() - std::min(file.size(), rewrite_suffix.size()));
        if (file.ends_with(rewrite_suffix) && is_table_file_name(name) && is_file(directory + "/" + file))
            names.push_back(directory + (directory.ends_with('/') ? "" : "/") + name);
    }
    return names;
}

// True if there was something to remove.
bool repair_table(const common_options & common, const place & where)
{
    const std::string rewrite_file = where.file + std::string(rewrite_suffix);
    std::uint64_t     bytes        = 0;
    if (!is_file(rewrite_file, &bytes)) {
        if (!is_file(where.file))
            throw no_such_table(where);
        return false;
    }
    const file_hold directory(where.directory + "/,Lock", where.name);
    const file_hold table_itself(where.file, where.name);
    const file_hold its_rewrite(rewrite_file, where.name);
    if (!common.dry_run) {
        kt_char_ptr_t name = writable(where.registry_path);
        const tree    its(where);
        its.mount(where);
        check(rg_repair_tables_1(its.handle(), &name, 1), where);
        if (is_file(rewrite_file))
            throw failure(exit_code::not_permitted, where.name,
                          fmt::format("{} can't be removed: is the directory writable?", rewrite_file), RG_E_ACCESS);
    }
    if (!common.quiet)
        say(fmt::format("{}: a leftover rewrite file of {} {} removed", where.name, counted(bytes, "byte"),
                        common.dry_run ? "would be" : "was"));
    return true;
}

} // namespace

// How far it has come: one that fails doesn't keep the others from being repaired.
struct progress {
    const common_options & common;
    std::size_t            removed = 0;
    exit_code              result  = exit_code::done;

    template <class Repair> void attempt(Repair && repair)
    {
        stop_if_interrupted();
        try {
            removed += repair() ? 1 : 0;
        } catch (const failure & what) {
            print_failure(what, common.errors);
            result = what.exit();
        }
    }
    [[nodiscard]] exit_code end() const
    {
        if (removed == 0 && result == exit_code::done && !common.quiet)
            say("nothing to repair");
        return removed != 0 && result != exit_code::done ? exit_code::done_in_part : result;
    }
};

// What a killed alter or unpack was making its tables in.
bool repair_staging(const common_options & common, const std::string & path)
{
    if (!common.dry_run)
        remove_staging(path);
    if (!common.quiet)
        say(fmt::format("{}: a leftover directory {} removed", path, common.dry_run ? "would be" : "was"));
    return true;
}

exit_code run_repair(const common_options & common, const tables_options & options)
{
    std::vector<place>       places;
    std::vector<std::string> stagings;
    for (const std::string & path : options.tables) {
        if (!is_directory(path)) {
            places.push_back(find_place(path));
            continue;
        }
        for (const std::string & table : tables_to_repair(path))
            places.push_back(find_place(table));
        for (const std::string & staging : leftover_stagings(path))
            stagings.push_back(staging);
    }
    note_interrupts();
    progress so_far{common};
    for (const place & where : places)
        so_far.attempt([&] { return repair_table(common, where); });
    for (const std::string & path : stagings)
        so_far.attempt([&] { return repair_staging(common, path); });
    return so_far.end();
}

} // namespace ktrg
