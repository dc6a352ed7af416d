// SPDX-License-Identifier: MIT
// ktrg pack: tables as one buffer of the packed form, in a file or on standard output.
//
// What the packed form can't carry is told, table by table; a structure that would arrive in pieces is refused.
#include <cstdlib>
#include <cstring>
#include <memory>

#include <fmt/format.h>
#include <unistd.h>

#include "interrupt.h"
#include "new_file.h"
#include "registry.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// The packer takes the first four bytes of the first field's name for its type. Behind a shorter name all the fields
// that follow are read shifted.
constexpr std::size_t lost_letters = 4;

void check_structures(const table & from)
{
    for (const column & each : from.columns())
        if (!each.fields.empty() && each.fields.front().name.size() < lost_letters)
            throw failure(exit_code::usage, from.where().name,
                          fmt::format("column \"{}\" can't be packed: the name of its first field, \"{}\", is shorter "
                                      "than {} letters; select -o jsonl carries it",
                                      each.name, each.fields.front().name, lost_letters));
}

// Says what stays behind.
void say_losses(const table & from)
{
    const std::string & name = from.where().name;
    if (from.blob().has_value())
        say(fmt::format("{}: its blob doesn't travel", name));
    for (const column & each : from.columns()) {
        if (!each.fields.empty())
            say(fmt::format("{}: column \"{}\": the first field of its structure, \"{}\", arrives as \"{}\"", name,
                            each.name, each.fields.front().name, each.fields.front().name.substr(lost_letters)));
        if (!each.fields.empty() && !each.default_text.empty())
            say(fmt::format("{}: column \"{}\": its default doesn't travel", name, each.name));
    }
}

std::vector<table> open_all(const pack_options & options)
{
    std::vector<table> tables;
    for (const std::string & name : options.tables) {
        place where = find_place(name);
        for (const table & other : tables)
            if (other.where().file_name == where.file_name)
                throw failure(
                    exit_code::usage, where.name,
                    fmt::format("{} has the same name: they couldn't be unpacked together", other.where().name));
        if (!options.prefix.empty()) {
            where.mounted_at    = options.prefix;
            where.registry_path = registry_path_at(options.prefix, where.file_name);
        }
        tables.push_back(table::open_for_reading(where));
        check_structures(tables.back());
    }
    return tables;
}

struct free_block {
    void operator()(void * p) const { std::free(p); }
};
using packed_block = std::unique_ptr<void, free_block>;

packed_block pack_all(const std::vector<table> & tables, const std::string & subject)
{
    std::vector<rg_opaque_handle_t> handles;
    for (const table & each : tables)
        handles.push_back(each.handle());
    std::vector<kt_uint32_t> zeros(tables.size(), 0); // committed state, all rows
    void *                   p_buffer = nullptr;
    const kt_int32_t code = rg_pack_tables_1(static_cast<kt_uint32_t>(handles.size()), handles.data(), zeros.data(),
                                             zeros.data(), nullptr, &p_buffer);
    if (code == RG_E_LIBRARY_CALL)
        throw failure(exit_code::input_output, subject,
                      "the tables can't be packed: a value is damaged, or together they exceed 4 GiB", code);
    if (code != 0)
        throw registry_failure(code, subject);
    return packed_block(p_buffer);
}

void write(const common_options & common, const std::string & file, std::string_view content)
{
    if (file == "-") {
        output_sink sink;
        sink.write(content);
        sink.flush();
        return;
    }
    new_file result(file, "", common.force);
    result.sink().write(content);
    result.finish();
}

} // namespace

exit_code run_pack(const common_options & common, const pack_options & options)
{
    const bool to_standard_output = options.file == "-";
    if (to_standard_output && isatty(STDOUT_FILENO) != 0)
        throw failure(exit_code::usage, "", "packed tables aren't for a terminal; redirect standard output");
    if (!to_standard_output)
        check_new_file(options.file, "", common.force);
    note_interrupts();
    const std::vector<table> tables = open_all(options);
    if (!common.quiet)
        for (const table & each : tables)
            say_losses(each);

    const std::string  name     = to_standard_output ? "standard output" : options.file;
    const packed_block p_packed = pack_all(tables, name);
    kt_uint32_t        length   = 0; // the buffer begins with it
    std::memcpy(&length, p_packed.get(), sizeof length);
    stop_if_interrupted();
    if (!common.dry_run)
        write(common, options.file, {static_cast<const char *>(p_packed.get()), length});
    if (!common.quiet)
        say(fmt::format("{}: {} {} ({} bytes)", name, counted(tables.size(), "table"),
                        common.dry_run ? "would be packed" : "packed", length));
    return exit_code::done;
}

} // namespace ktrg
