// SPDX-License-Identifier: MIT
// ktrg unpack: tables of a packed file, as files in a directory; or what the packed file holds.
//
// Nothing appears in the directory before every table is made and each of its values was looked at.
#include <fmt/format.h>

#include "interrupt.h"
#include "packed_file.h"
#include "staging.h"
#include "whole_table.h"

namespace ktrg
{

namespace
{

const char * byte_order_of(const packed_file & from)
{
    return from.big_endian() ? "big-endian" : "little-endian";
}

// ---- --info ----

struct description {
    packed_table             packed;
    std::uint64_t            rows = 0; // that are in the file
    std::vector<std::string> columns;
};

std::vector<description> describe(packed_file & from)
{
    std::vector<description> result;
    for (std::size_t i = 0; i < from.tables().size(); i++) {
        stop_if_interrupted();
        const packed_table & packed = from.tables()[i];
        place                where;
        where.name           = fmt::format("{}: {}", from.name(), packed.path);
        const table unpacked = from.unpack(i, where);
        result.push_back({packed, unpacked.count(), {}});
        for (const column & each : unpacked.columns())
            result.back().columns.push_back(column_text(each));
    }
    return result;
}

void write_text(output_sink & sink, const packed_file & from, const std::vector<description> & tables)
{
    const auto line = [&sink](std::string_view name, const auto & value) {
        sink.write(fmt::format("{:<12}{}\n", name, value));
    };
    line("file", from.name());
    line("byte order", byte_order_of(from));
    line("bytes", from.bytes());
    line("tables", tables.size());
    for (const description & each : tables) {
        sink.write("\n");
        line("table", each.packed.file_name.empty() ? "(no file can have its name)" : each.packed.file_name);
        line("  path", each.packed.path);
        line("  sender", each.packed.sender_name);
        line("  rows", each.rows);
        line("  counter", each.packed.counter);
        line("  bytes", each.packed.bytes);
        for (const std::string & column : each.columns)
            line(&column == &each.columns.front() ? "  columns" : "", column);
    }
}

void write_rows(output_sink & sink, const output_style & style, const packed_file & from,
                const std::vector<description> & tables)
{
    const auto writer = make_row_writer(style, sink);
    writer->begin({{"table", false},
                   {"path", false},
                   {"sender", false},
                   {"rows", true},
                   {"columns", true},
                   {"counter", true},
                   {"bytes", true},
                   {"byte_order", false},
                   {"schema", false}});
    for (const description & each : tables)
        writer->row({each.packed.file_name.empty() ? cell{} : cell::of_text(each.packed.file_name),
                     cell::of_text(each.packed.path), cell::of_text(each.packed.sender_name),
                     cell::of_number(each.rows), cell::of_number(each.columns.size()),
                     cell::of_number(each.packed.counter), cell::of_number(each.packed.bytes),
                     cell::of_text(byte_order_of(from)),
                     cell::of_text(fmt::format("{}", fmt::join(each.columns, " ")))});
    writer->end();
}

exit_code show_info(const common_options & common, packed_file & from)
{
    const std::vector<description> tables = describe(from);
    output_sink                    sink;
    if (common.form.has_value())
        write_rows(sink, common.style_or(output_form::table), from, tables);
    else
        write_text(sink, from, tables);
    sink.flush();
    return exit_code::done;
}

// ---- Making tables ----

struct arrival {
    place         target;
    bool          replaces = false;
    std::uint64_t rows     = 0;
};

// Where each table goes. All of them are checked before anything is made.
std::vector<arrival> arrivals(const common_options & common, const packed_file & from, const std::string & directory)
{
    if (!is_directory(directory))
        throw failure(exit_code::not_found, directory, "no such directory");
    std::vector<arrival> result;
    for (const packed_table & packed : from.tables()) {
        if (packed.file_name.empty())
            throw failure(exit_code::usage, from.name(),
                          fmt::format("no file can have the name of the table {}", in_quotes(packed.path)),
                          RG_E_INVALID_PATH);
        arrival each;
        each.target = find_place(directory + (directory.ends_with('/') ? "" : "/") + packed.file_name);
        for (const arrival & other : result)
            if (other.target.file_name == each.target.file_name)
                throw failure(exit_code::conflict, from.name(),
                              fmt::format("two tables would have the name \"{}\"", packed.file_name),
                              RG_E_TABLE_EXISTS);
        each.replaces = check_target(common, each.target);
        result.push_back(std::move(each));
    }
    return result;
}

// A structure's first field that came with letters for a type.
void say_losses(const place & target, const std::vector<column> & columns)
{
    for (const column & each : columns)
        if (!each.fields.empty() && !is_value_type(each.fields.front().type))
            say(fmt::format("{}: column \"{}\": the first field of its structure came without its first letters, as "
                            "\"{}\"",
                            target.name, each.name, each.fields.front().name));
}

void make_all(const common_options & common, packed_file & from, std::vector<arrival> & tables)
{
    std::optional<staging> stage;
    if (!common.dry_run && !tables.empty())
        stage.emplace(tables.front().target);
    for (std::size_t i = 0; i < tables.size(); i++) {
        stop_if_interrupted();
        table unpacked = from.unpack(i, tables[i].target);
        tables[i].rows = unpacked.count();
        if (!common.quiet)
            say_losses(tables[i].target, unpacked.columns());
        if (stage.has_value())
            copy_table(unpacked, stage->place_for(tables[i].target), false);
    }
    stop_if_interrupted();
    for (std::size_t i = 0; stage.has_value() && i < tables.size(); i++) {
        try {
            wait_for_target(tables[i].target, common.wait_seconds);
            rename_table(stage->place_for(tables[i].target), tables[i].target, common.force);
        } catch (const failure & what) {
            if (i == 0)
                throw;
            throw failure(exit_code::done_in_part, what.subject(),
                          fmt::format("{}; the {} in front of it {} unpacked", what.text(), counted(i, "table"),
                                      i == 1 ? "is" : "are"),
                          what.code());
        }
    }
}

} // namespace

exit_code run_unpack(const common_options & common, const unpack_options & options)
{
    if (options.info != options.directory.empty())
        throw failure(exit_code::usage, options.file, "unpack wants a directory for the tables, or --info");
    note_interrupts();
    packed_file from = packed_file::read(options.file);
    if (options.info)
        return show_info(common, from);
    std::vector<arrival> tables = arrivals(common, from, options.directory);
    make_all(common, from, tables);
    if (common.quiet)
        return exit_code::done;
    for (const arrival & each : tables)
        say(fmt::format("{}: {}{} ({})", each.target.name, common.dry_run ? "would be unpacked" : "unpacked",
                        each.replaces ? " over the table that was there" : "", counted(each.rows, "row")));
    if (tables.empty())
        say(fmt::format("{}: no tables in it", from.name()));
    return exit_code::done;
}

} // namespace ktrg
