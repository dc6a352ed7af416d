// SPDX-License-Identifier: MIT
// import_input: see its header.
#include "import_input.h"

#include <algorithm>

#include <fmt/format.h>

#include "csv_reader.h"
#include "failure.h"
#include "json_reader.h"
#include "tsv_reader.h"
#include "type_detection.h"

namespace ktrg
{

namespace
{

input_format format_of(const import_options & options)
{
    if (options.format == "json" || (options.format.empty() && options.file.ends_with(".json")))
        return input_format::json;
    if (options.format == "jsonl" ||
        (options.format.empty() && (options.file.ends_with(".jsonl") || options.file.ends_with(".ndjson"))))
        return input_format::jsonl;
    if (options.format == "tsv" || (options.format.empty() && options.file.ends_with(".tsv")))
        return input_format::tsv;
    return input_format::csv;
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

// `FROM=TO` gives a column another name, and `FROM=` leaves it out.
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

void check_widths(const place & where, const input & from)
{
    for (std::size_t row = from.first_row; row < from.rows.size(); row++)
        if (from.rows.cells_of(row) != from.headings.size())
            throw failure(exit_code::usage, where.name,
                          fmt::format("{}: {} fields, where the {} has {}", from.place_of(row), from.rows.cells_of(row),
                                      from.first_row != 0 ? "header" : "first line", from.headings.size()));
}

// Rows of one width below a header, or without one.
void take_table(input & result, std::string_view text, const common_options & common, const place & where)
{
    result.rows = result.format == input_format::tsv ? read_tsv(text) : read_csv(text, where.name, result.file_name);
    if (result.rows.size() == 0)
        throw failure(exit_code::usage, where.name, fmt::format("{}: empty, not even a header", result.file_name));
    for (std::size_t i = 0; i < result.rows.cells_of(0); i++)
        result.headings.push_back(common.style.header ? std::string(result.rows.at(0, i).text)
                                                      : fmt::format("c{}", i + 1));
    result.first_row = common.style.header ? 1 : 0;
    check_widths(where, result);
}

void take_json(input & result, std::string_view text, const place & where)
{
    json_rows read  = read_json(text, result.format == input_format::jsonl, where.name, result.file_name);
    result.headings = std::move(read.names);
    result.rows     = std::move(read.rows);
}

kt_data_type_t detected_type(const place & where, const input & from, std::size_t i, const std::string & null_text)
{
    type_detector detector;
    for (std::size_t row = from.first_row; row < from.rows.size(); row++) {
        const text_cell cell = from.rows.at(row, i);
        if (!is_missing(cell, KT_UNKNOWN, null_text))
            detector.look_at(cell);
    }
    const kt_data_type_t type = detector.type();
    if (type == KT_UNKNOWN)
        throw failure(
            exit_code::usage, where.name,
            fmt::format("column \"{}\" holds objects, or arrays of several types; --types says what they are, "
                        "as in {}:struct(street:string,number:int32)",
                        from.names[i], from.names[i]));
    return type;
}

std::vector<column> given_columns(const import_options & options, const place & where, const input & from)
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
    return given;
}

// Puts the key in front, where the registry keeps it.
void place_key(const common_options & common, const import_options & options, const place & where,
               std::vector<column> & columns)
{
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
}

} // namespace

std::string input::place_of(std::size_t row) const
{
    return fmt::format("{}:{}", file_name, rows.line_of(row));
}

input read_input(const common_options & common, const import_options & options, const place & where)
{
    const stopwatch time;
    input           result;
    result.file_name       = options.file == "-" ? "standard input" : options.file;
    result.format          = format_of(options);
    const std::string text = read_whole(options.file, where.name);
    if (result.is_json())
        take_json(result, text, where);
    else
        take_table(result, text, common, where);
    tell(fmt::format("{}: read: {}, {}, {} bytes, {}", result.file_name, counted(result.count(), "row"),
                     counted(result.headings.size(), "column"), text.size(), time.text()));
    result.names = result.headings;
    rename_columns(where, options, result.names);
    if (!options.create)
        return result;
    for (std::string & name : result.names) {
        const std::string good = name.empty() ? name : column_name_for(name);
        if (good != name && !common.quiet)
            say(fmt::format("column {} becomes \"{}\"", in_quotes(name), good));
        name = good;
    }
    return result;
}

bool is_missing(const text_cell & cell, kt_data_type_t type, const std::string & null_text)
{
    return cell.kind == text_kind::missing || (cell.text.empty() && type != KT_CHAR_PTR) ||
           (!null_text.empty() && cell.text == null_text);
}

std::vector<column> new_columns(const common_options & common, const import_options & options, const place & where,
                                const input & from)
{
    const std::vector<column> given = given_columns(options, where, from);
    std::vector<column>       columns;
    for (std::size_t i = 0; i < from.names.size(); i++) {
        if (from.names[i].empty())
            continue;
        const auto found =
            std::find_if(given.begin(), given.end(), [&](const column & each) { return each.name == from.names[i]; });
        column each;
        if (found != given.end()) {
            each = *found;
        } else {
            each.name = from.names[i];
            each.type = detected_type(where, from, i, common.style.null_text);
        }
        columns.push_back(each);
    }
    if (columns.empty())
        throw failure(exit_code::usage, where.name, fmt::format("{}: it has no columns", from.file_name));
    place_key(common, options, where, columns);
    return columns;
}

std::vector<input_column> input_columns(const place & where, const input & from, const std::vector<column> & columns)
{
    std::vector<input_column> result;
    std::set<std::string>     seen;
    for (std::size_t i = 0; i < from.names.size(); i++) {
        const std::string & name = from.names[i];
        if (name.empty())
            continue;
        result.push_back({i, columns[find_column(columns, name, where.name)]});
        if (!seen.insert(name).second)
            throw failure(exit_code::usage, where.name,
                          fmt::format("{}: the column \"{}\" stands twice in the header", from.file_name, name),
                          RG_E_DUPLICATE_COLUMN);
    }
    if (seen.count(columns.front().name) == 0 && from.count() != 0)
        throw failure(exit_code::usage, where.name,
                      fmt::format("{}: the key \"{}\" is missing{}", from.file_name, columns.front().name,
                                  from.first_row != 0 ? " in the header" : ""),
                      RG_E_KEY_EXPECTED);
    return result;
}

} // namespace ktrg
