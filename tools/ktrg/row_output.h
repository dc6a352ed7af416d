// SPDX-License-Identifier: MIT
// row_output: rows of a table on their way to standard output: what get and select share.
#pragma once

#include "output.h"
#include "registry.h"

namespace ktrg
{

// The named columns, in the order of the names; all that aren't invisible if there are no names.
[[nodiscard]] std::vector<column> chosen_columns(const table & from, const std::vector<std::string> & names);

[[nodiscard]] std::vector<cell> cells_of(const row_values & values, const value_style & style);

class row_output
{
  public:
    row_output(const output_style & style, const std::vector<column> & columns, output_sink & sink);
    void                      write(const row_values & values);
    void                      write(const std::vector<cell> & cells);
    void                      end();
    [[nodiscard]] std::size_t count() const { return count_; }

  private:
    output_style                style_;
    output_sink &               sink_;
    std::unique_ptr<row_writer> writer_;
    std::size_t                 count_ = 0;
};

} // namespace ktrg
