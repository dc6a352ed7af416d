// SPDX-License-Identifier: MIT
// import_rows: see its header.
#include "import_rows.h"

#include <fmt/format.h>

#include "failure.h"
#include "utf8.h"

namespace ktrg
{

// ---- Into the table ----

row_importer::row_importer(const common_options & common, const input & from, const table & to, on_conflict conflicts)
    : null_text_(common.style.null_text), from_(from), to_(to), conflicts_(conflicts),
      columns_(input_columns(to.where(), from, to.columns())), values_(columns_.size())
{
    for (std::size_t i = 0; i < columns_.size(); i++)
        if (columns_[i].of.is_key())
            key_ = i;
}

kt_value_t row_importer::parse(std::size_t row, const input_column & of, std::string_view text)
{
    try {
        return parse_value(of.of.type, of.of.fields, text, arena_);
    } catch (const failure & what) {
        throw failure(what.exit(), to_.where().name,
                      fmt::format("{}: column \"{}\": {}", from_.place_of(row), of.of.name, what.text()));
    }
}

void row_importer::take_values(std::size_t row)
{
    arena_.clear();
    names_.clear();
    addresses_.clear();
    for (std::size_t i = 0; i < columns_.size(); i++) {
        const input_column & each = columns_[i];
        const text_cell      cell = from_.rows.at(row, each.position);
        if (is_missing(cell, each.of.type, null_text_) && !each.of.is_key())
            continue; // takes the column's default, or keeps its value
        // An empty text may be a key; an object without one is a mistake.
        if (each.of.is_key() && cell.kind == text_kind::missing && from_.is_json())
            throw failure(exit_code::usage, to_.where().name,
                          fmt::format("{}: the key \"{}\" is missing", from_.place_of(row), each.of.name),
                          RG_E_KEY_EXPECTED);
        if (each.of.type == KT_CHAR_PTR && !is_utf8(cell.text))
            foreign_cells_++;
        values_[i] = parse(row, each, cell.text);
        if (i == key_)
            key_given_ = names_.size();
        names_.push_back(const_cast<kt_char_ptr_t>(each.of.name.c_str()));
        addresses_.push_back(&values_[i]);
    }
}

// Keys of a table that may repeat never conflict by themselves. Who asks for updates means the row that is there.
bool row_importer::row_exists() const
{
    return conflicts_ != on_conflict::refuse && (columns_[key_].of.qualifier & 15) == RG_PRIMARY_KEY_NOCHECK &&
           to_.contains(values_[key_]);
}

void row_importer::import(std::size_t row)
{
    take_values(row);
    const kt_int32_t code = row_exists() ? RG_E_DUPLICATE_KEY : to_.add(names_, addresses_);
    if (code == 0)
        added_++;
    else if (code == RG_E_DUPLICATE_KEY)
        meet_conflict(row);
    else
        throw registry_failure(code, to_.where().name, from_.place_of(row));
}

void row_importer::meet_conflict(std::size_t row)
{
    if (conflicts_ == on_conflict::skip) {
        skipped_++;
    } else if (conflicts_ == on_conflict::update) {
        update(row);
        updated_++;
    } else {
        const std::string_view key = from_.rows.at(row, columns_[key_].position).text;
        throw failure(exit_code::conflict, to_.where().name,
                      fmt::format("{}: a row with the key {} exists", from_.place_of(row), in_quotes(key)),
                      RG_E_DUPLICATE_KEY);
    }
}

void row_importer::update(std::size_t row)
{
    for (const input_column & each : columns_)
        if (!each.of.is_key() && (each.of.qualifier & RG_PROTECTED) != 0 &&
            !is_missing(from_.rows.at(row, each.position), each.of.type, null_text_))
            throw protected_column(each.of, to_.where().name, from_.place_of(row));
    names_.erase(names_.begin() + static_cast<std::ptrdiff_t>(key_given_));
    addresses_.erase(addresses_.begin() + static_cast<std::ptrdiff_t>(key_given_));
    if (const kt_int32_t code = to_.set(values_[key_], names_, addresses_); code != 0)
        throw registry_failure(code, to_.where().name, from_.place_of(row));
}

// ---- What is refused ----

namespace
{

output_form form_for(input_format format)
{
    switch (format) {
    case input_format::csv:
        return output_form::csv;
    case input_format::tsv:
        return output_form::tsv;
    case input_format::json:
    case input_format::jsonl:
        break;
    }
    return output_form::jsonl;
}

cell as_it_came(const text_cell & from)
{
    switch (from.kind) {
    case text_kind::missing:
        return {};
    case text_kind::number:
        return {cell_kind::number, std::string(from.text)};
    case text_kind::nested:
        return {cell_kind::json, std::string(from.text)};
    case text_kind::plain:
    case text_kind::string:
        break;
    }
    return cell::of_text(std::string(from.text));
}

} // namespace

reject_file::reject_file(const common_options & common, const import_options & options, const input & from)
    : common_(common), from_(from), path_(options.rejects), subject_(find_place(options.table).name)
{
    if (wanted())
        check_new_file(path_, subject_, common.force);
}

void reject_file::add(std::size_t row, const failure & reason)
{
    constexpr std::size_t most_shown = 10;
    if (count_++ < most_shown)
        print_failure(reason, common_.errors);
    if (common_.dry_run)
        return;
    if (file_ == nullptr) {
        file_              = std::make_unique<new_file>(path_, subject_, common_.force);
        output_style style = common_.style;
        style.form         = form_for(from_.format);
        writer_            = make_row_writer(style, file_->sink());
        std::vector<output_column> columns;
        for (const std::string & heading : from_.headings)
            columns.push_back({heading, false});
        columns.push_back({"reject_reason", false});
        writer_->begin(columns);
    }
    std::vector<cell> cells;
    for (std::size_t i = 0; i < from_.headings.size(); i++)
        cells.push_back(as_it_came(from_.rows.at(row, i)));
    cells.push_back(cell::of_text(reason.text()));
    writer_->row(cells);
}

void reject_file::finish()
{
    if (file_ == nullptr)
        return;
    writer_->end();
    file_->finish();
}

} // namespace ktrg
