// SPDX-License-Identifier: MIT
// import_rows: brings the rows of a file into a table, one by one.
#pragma once

#include <memory>

#include "import_input.h"
#include "new_file.h"
#include "registry.h"

namespace ktrg
{

// What becomes of a row whose key the table has already.
enum class on_conflict { refuse, update, skip };

class row_importer
{
  public:
    row_importer(const common_options & common, const input & from, const table & to, on_conflict conflicts);

    // Adds the row, or what the conflicts say. Throws the failure of a row that can't be had, and then the table is as
    // it was before the row.
    void import(std::size_t row);

    [[nodiscard]] std::size_t added() const { return added_; }
    [[nodiscard]] std::size_t updated() const { return updated_; }
    [[nodiscard]] std::size_t skipped() const { return skipped_; }
    // Cells with bytes that aren't UTF-8. They are kept as they are.
    [[nodiscard]] std::size_t foreign_cells() const { return foreign_cells_; }

  private:
    void                     take_values(std::size_t row);
    [[nodiscard]] kt_value_t parse(std::size_t row, const input_column & of, std::string_view text);
    [[nodiscard]] bool       row_exists() const;
    void                     meet_conflict(std::size_t row);
    void                     update(std::size_t row);

    const std::string &        null_text_;
    const input &              from_;
    const table &              to_;
    on_conflict                conflicts_;
    std::vector<input_column>  columns_;
    std::vector<kt_value_t>    values_; // of the row under way, as the next two
    std::vector<kt_char_ptr_t> names_;
    std::vector<kt_value_t *>  addresses_;
    std::size_t                key_       = 0; // position among the columns
    std::size_t                key_given_ = 0; // position among the names
    value_arena                arena_;
    std::size_t                added_         = 0;
    std::size_t                updated_       = 0;
    std::size_t                skipped_       = 0;
    std::size_t                foreign_cells_ = 0;
};

// The rows that were refused, in a file of the input's form, with the reason in a column behind theirs. Made when the
// first one comes.
class reject_file
{
  public:
    // An empty path: there is none, and a row that is refused ends the import.
    reject_file(const common_options & common, const import_options & options, const input & from);

    [[nodiscard]] bool        wanted() const { return !path_.empty(); }
    [[nodiscard]] std::size_t count() const { return count_; }

    void add(std::size_t row, const failure & reason);
    void finish();

  private:
    const common_options &      common_;
    const input &               from_;
    std::string                 path_;
    std::string                 subject_;
    std::unique_ptr<new_file>   file_;
    std::unique_ptr<row_writer> writer_;
    std::size_t                 count_ = 0;
};

} // namespace ktrg
