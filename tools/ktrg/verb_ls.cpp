// SPDX-License-Identifier: MIT
// ktrg ls: the tables of a directory.
//
// Each file is read record by record, without a lock, so that a listing never waits. A file that begins like a table
// but isn't sound is listed with what is known of it and told on standard error.
#include <array>
#include <ctime>

#include <fmt/format.h>
#include <sys/stat.h>

#include "place.h"
#include "table_file.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

std::string time_text(const std::timespec & when)
{
    std::tm              parts{};
    std::array<char, 32> text{};
    gmtime_r(&when.tv_sec, &parts);
    std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%SZ", &parts);
    return text.data();
}

std::vector<cell> cells_of(const std::string & name, const table_file & file)
{
    return {cell::of_text(name),          cell::of_number(file.rows),    cell::of_number(file.columns.size()),
            cell::of_number(file.length), cell::of_number(file.counter), cell::of_text(time_text(file.changed))};
}

std::vector<cell> cells_of_damaged(const std::string & name, const std::string & path)
{
    struct stat status {
    };
    std::vector<cell> cells = {cell::of_text(name), cell{}, cell{}, cell{}, cell{}, cell{}};
    if (stat(path.c_str(), &status) == 0) {
        cells[3] = cell::of_number(static_cast<std::uint64_t>(status.st_size));
        cells[5] = cell::of_text(time_text(status.st_mtim));
    }
    return cells;
}

} // namespace

exit_code run_ls(const common_options & common, const ls_options & options)
{
    const std::string              directory = options.directory.empty() ? root_directory() : options.directory;
    const std::vector<std::string> names     = tables_in(directory);

    exit_code          result = exit_code::done;
    output_sink        sink;
    const output_style style  = common.style_or(output_form::table);
    const auto         writer = make_row_writer(style, sink);
    writer->begin(
        {{"table", false}, {"rows", true}, {"columns", true}, {"bytes", true}, {"counter", true}, {"changed", false}});
    for (const std::string & name : names) {
        const std::string path = directory + "/" + name;
        try {
            writer->row(cells_of(name, read_table_file(path, path)));
        } catch (const failure & what) {
            if (what.exit() == exit_code::not_found)
                continue; // it went away meanwhile
            writer->row(cells_of_damaged(name, path));
            print_failure(what, common.errors);
            result = what.exit();
        }
    }
    writer->end();
    sink.flush();
    if (style.form == output_form::table && !common.quiet)
        say(fmt::format("{} {} in {}", names.size(), names.size() == 1 ? "table" : "tables", directory));
    return result;
}

} // namespace ktrg
