// SPDX-License-Identifier: MIT
// ktrg export: all rows of a table on standard output, in a form that other programs read and import takes back.
#include <fmt/format.h>

#include "interrupt.h"
#include "place.h"
#include "registry.h"
#include "row_output.h"
#include "verbs.h"

namespace ktrg
{

exit_code run_export(const common_options & common, const export_options & options)
{
    const place        where = find_place(options.table);
    const output_style style = common.style_or(output_form::csv);
    if (style.form == output_form::table || style.form == output_form::line)
        throw failure(exit_code::usage, where.name,
                      "export writes csv, tsv, json, jsonl or markdown; select shows rows to people");
    note_interrupts();
    const table opened = table::open_for_reading(where);
    // Invisible columns go along: what is exported can make the table again.
    std::vector<std::string> names = options.columns.empty() ? column_names(opened.columns()) : options.columns;

    output_sink sink;
    row_values  values(chosen_columns(opened, names));
    row_output  rows(style, values.columns(), sink);
    for (std::uint64_t position = 0; opened.read(position, values); position++) {
        stop_if_interrupted();
        rows.write(values);
    }
    rows.end();
    if (!common.quiet)
        say(fmt::format("{}: {} exported", where.name, counted(rows.count(), "row")));
    return exit_code::done;
}

} // namespace ktrg
