// SPDX-License-Identifier: MIT
// ktrg import: rows of a text file into a table, in one transaction.
//
// Nothing is written before the last row is in: a value that doesn't fit, a key that exists or an interrupt leaves the
// table as it was, and a table that was to be created doesn't stay.
#include <algorithm>
#include <set>

#include <fmt/format.h>

#include "csv_reader.h"
#include "interrupt.h"
#include "place.h"
#include "registry.h"
#include "type_detection.h"
#include "utf8.h"
#include "values.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

// The file, and what its columns are called in the table.
struct input {
    std::string              file_name; // "standard input" for "-"
    csv_text                 text;
    std::vector<std::string> names;
    std::size_t              first_row = 0; // the record behind the header
};

char separator_of(const import_options & options)
{
    if (options.format.empty())
        return options.file.ends_with(".tsv") ? '\t' : ',';
    return options.format == "tsv" ? '\t' : ',';
}

// A name that a column can have, for one that it can't: "Installed-Size" becomes Installed_Size.
std::string column_name_for(std::string_view heading)
{
    std::string name;
    for (const char c : heading) {
        const bool taken = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
        name += taken ? c : '_';
    }
    if (name.empty() || !is_column_name(name.substr(0, 1)))
        name = "c" + name;
    constexpr std::size_t longest = 255;
    name.resize(std::min(name.size(), longest));
    return name;
}

void rename_columns(const place & where, const import_options & options, std::vector<std::string> & names)
{
    for (const std::string & pair : options.renamed) {
        const std::size_t equals = pair.find('=');
        if (equals == std::string::npos)
            throw failure(exit_code::usage, where.name, fmt::format("--map wants FROM=TO, not {}", in_quotes(pair)));
        const auto found = std::find(names.begin(), names.end(), pair.substr(0, equals));
        if (found == names.end())
            throw failure(exit_code::usage, where.name,
                          fmt::format("--map: the file has no column {}{}", in_quotes(pair.substr(0, equals)),
                                      did_you_mean(pair.substr(0, equals), names)),
                          RG_E_INVALID_COLUMN);
        *found = pair.substr(equals + 1);
    }
}

input read_input(const common_options & common, const import_options & options, const place & where)
{
    input result;
    result.file_name       = options.file == "-" ? "standard input" : options.file;
    const std::string text = read_whole(options.file, where.name);
    result.text            = csv_text::parse(text, separator_of(options), where.name, result.file_name);
    if (result.text.size() == 0)
        throw failure(exit_code::usage, where.name, fmt::format("{}: empty, not even a header", result.file_name));
    for (std::size_t i = 0; i < result.text.cells_of(0); i++)
        result.names.push_back(common.style.header ? std::string(result.text.at(0, i).text)
                                                   : fmt::format("c{}", i + 1));
    result.first_row = common.style.header ? 1 : 0;
    rename_columns(where, options, result.names);
    if (!options.create)
        return result;
    for (std::string & name : result.names) {
        const std::string good = column_name_for(name);
        if (good != name && !common.quiet)
            say(fmt::format("column {} becomes \"{}\"", in_quotes(name), good));
        name = good;
    }
    return result;
}

void check_widths(const place & where, const input & from)
{
    for (std::size_t row = from.first_row; row < from.text.size(); row++)
        if (from.text.cells_of(row) != from.names.size())
            throw failure(exit_code::usage, where.name,
                          fmt::format("{}:{}: {} fields, where the {} has {}", from.file_name, from.text.line_of(row),
                                      from.text.cells_of(row), from.first_row != 0 ? "header" : "first line",
                                      from.names.size()));
}

// Many programs quote every cell, so quotes make a difference for strings only.
bool is_missing(const csv_text::csv_cell & cell, kt_data_type_t type, const std::string & null_text)
{
    return cell.missing || (cell.text.empty() && type != KT_CHAR_PTR) || (!null_text.empty() && cell.text == null_text);
}

// ---- The columns of a table that is to be created ----

kt_data_type_t detected_type(const input & from, std::size_t i, const std::string & null_text)
{
    type_detector detector;
    for (std::size_t row = from.first_row; row < from.text.size(); row++) {
        const csv_text::csv_cell cell = from.text.at(row, i);
        if (!is_missing(cell, KT_UNKNOWN, null_text))
            detector.look_at(cell.text);
    }
    return detector.type();
}

// The columns that --types names, with the others detected, in the order of the file; the key comes first.
std::vector<column> new_columns(const common_options & common, const import_options & options, const place & where,
                                const input & from)
{
    std::vector<column> given;
    for (const std::string & text : options.types)
        for (column & each : parse_columns(text))
            given.push_back(std::move(each));
    for (const column & each : given)
        if (std::find(from.names.begin(), from.names.end(), each.name) == from.names.end())
            throw failure(exit_code::usage, where.name,
                          fmt::format("--types: the file has no column {}{}", in_quotes(each.name),
                                      did_you_mean(each.name, from.names)),
                          RG_E_INVALID_COLUMN);

    std::vector<column> columns;
    for (std::size_t i = 0; i < from.names.size(); i++) {
        const auto found =
            std::find_if(given.begin(), given.end(), [&](const column & each) { return each.name == from.names[i]; });
        column each;
        if (found != given.end()) {
            each = *found;
        } else {
            each.name = from.names[i];
            each.type = detected_type(from, i, common.style.null_text);
        }
        columns.push_back(each);
    }

    const auto marked = std::find_if(columns.begin(), columns.end(), [](const column & each) { return each.is_key(); });
    std::size_t key   = marked == columns.end() ? 0 : static_cast<std::size_t>(marked - columns.begin());
    if (!options.key.empty()) {
        key = find_column(columns, options.key, where.name);
    } else if (marked == columns.end() && !common.quiet) {
        say(fmt::format("{}: the key is the first column, \"{}\"; --key chooses another", where.name, columns[0].name));
    }
    if (!columns[key].is_key())
        columns[key].qualifier = (columns[key].qualifier & ~15U) | RG_PRIMARY_KEY;
    if (!can_be_key(columns[key].type))
        throw failure(
            exit_code::usage, where.name,
            fmt::format("column \"{}\" can't be the key: a key is a number, a string or a handle", columns[key].name),
            RG_E_INVALID_COLUMN);
    std::rotate(columns.begin(), columns.begin() + static_cast<std::ptrdiff_t>(key),
                columns.begin() + static_cast<std::ptrdiff_t>(key) + 1);
    return columns;
}

// ---- Rows ----

// For each field of the file, the table's column.
std::vector<column> columns_of_fields(const place & where, const input & from, const std::vector<column> & columns)
{
    std::vector<column>   result;
    std::set<std::string> seen;
    for (const std::string & name : from.names) {
        result.push_back(columns[find_column(columns, name, where.name)]);
        if (!seen.insert(name).second)
            throw failure(exit_code::usage, where.name,
                          fmt::format("{}: the column \"{}\" stands twice in the header", from.file_name, name),
                          RG_E_DUPLICATE_COLUMN);
    }
    if (seen.count(columns.front().name) == 0)
        throw failure(exit_code::usage, where.name,
                      fmt::format("{}: the key \"{}\" is missing in the header", from.file_name, columns.front().name),
                      RG_E_KEY_EXPECTED);
    return result;
}

class row_adder
{
  public:
    row_adder(const common_options & common, const place & where, const input & from, const table & to)
        : null_text_(common.style.null_text), where_(where), from_(from), to_(to),
          columns_(columns_of_fields(where, from, to.columns())), values_(columns_.size())
    {
    }

    void add(std::size_t row)
    {
        arena_.clear();
        names_.clear();
        addresses_.clear();
        for (std::size_t i = 0; i < columns_.size(); i++) {
            const csv_text::csv_cell cell = from_.text.at(row, i);
            if (is_missing(cell, columns_[i].type, null_text_) && !columns_[i].is_key())
                continue; // takes the column's default
            if (columns_[i].type == KT_CHAR_PTR && !is_utf8(cell.text))
                foreign_cells_++;
            values_[i] = parse(row, columns_[i], cell.text);
            names_.push_back(const_cast<kt_char_ptr_t>(columns_[i].name.c_str()));
            addresses_.push_back(&values_[i]);
        }
        if (const kt_int32_t code = to_.add(names_, addresses_); code != 0)
            refuse(row, code);
    }

    // Cells with bytes that aren't UTF-8. They are kept as they are.
    [[nodiscard]] std::size_t foreign_cells() const { return foreign_cells_; }

  private:
    kt_value_t parse(std::size_t row, const column & of, std::string_view text)
    {
        try {
            return parse_value(of.type, of.fields, text, arena_);
        } catch (const failure & what) {
            throw failure(what.exit(), where_.name,
                          fmt::format("{}: column \"{}\": {}", place_of(row), of.name, what.text()));
        }
    }

    [[nodiscard]] std::string place_of(std::size_t row) const
    {
        return fmt::format("{}:{}", from_.file_name, from_.text.line_of(row));
    }

    [[noreturn]] void refuse(std::size_t row, kt_int32_t code) const
    {
        if (code != RG_E_DUPLICATE_KEY)
            throw registry_failure(code, where_.name, place_of(row));
        std::string key;
        for (std::size_t i = 0; i < columns_.size(); i++)
            if (columns_[i].is_key())
                key = from_.text.at(row, i).text;
        throw failure(exit_code::conflict, where_.name,
                      fmt::format("{}: a row with the key {} exists", place_of(row), in_quotes(key)), code);
    }

    const std::string &        null_text_;
    const place &              where_;
    const input &              from_;
    const table &              to_;
    std::vector<column>        columns_;
    std::vector<kt_value_t>    values_;
    std::vector<kt_char_ptr_t> names_;
    std::vector<kt_value_t *>  addresses_;
    value_arena                arena_;
    std::size_t                foreign_cells_ = 0;
};

table open_target(const common_options & common, const import_options & options, const place & where,
                  const input & from)
{
    const std::size_t rows = from.text.size() - from.first_row;
    if (!options.create)
        return table::open_for_writing(where, common.wait_seconds);
    const std::vector<column> columns = new_columns(common, options, where, from);
    columns_of_fields(where, from, columns);
    // A dry run goes through all of it in memory.
    return common.dry_run ? table::create_in_memory(where, columns, rows) : table::create(where, columns, rows);
}

void refuse_wrong_options(const import_options & options, const place & where)
{
    if (options.create)
        return;
    if (!options.types.empty() || !options.key.empty())
        throw failure(exit_code::usage, where.name, "--key and --types go with --create");
}

} // namespace

exit_code run_import(const common_options & common, const import_options & options)
{
    const place where = find_place(options.table);
    refuse_wrong_options(options, where);
    note_interrupts();
    const input from = read_input(common, options, where);
    check_widths(where, from);

    table       to      = open_target(common, options, where, from);
    const bool  fresh   = options.create && !common.dry_run;
    std::size_t rows    = 0;
    std::size_t foreign = 0;
    try {
        row_adder adder(common, where, from, to);
        for (std::size_t row = from.first_row; row < from.text.size(); row++, rows++) {
            stop_if_interrupted();
            adder.add(row);
        }
        foreign = adder.foreign_cells();
        if (!common.dry_run)
            to.commit();
    } catch (...) {
        if (fresh)
            to.remove();
        throw;
    }
    to.close();
    if (!common.quiet) {
        if (foreign != 0)
            say(fmt::format("{}: {} {} not UTF-8; the bytes are kept, and shown escaped", where.name, foreign,
                            foreign == 1 ? "cell is" : "cells are"));
        say(fmt::format("{}: {}{} {} {}", where.name, rows, rows == 1 ? " row" : " rows",
                        common.dry_run ? "would be"
                        : rows == 1    ? "was"
                                       : "were",
                        fresh ? "imported into a new table" : "imported"));
    }
    return exit_code::done;
}

} // namespace ktrg
