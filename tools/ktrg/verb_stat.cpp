// SPDX-License-Identifier: MIT
// ktrg stat: what a table's file is made of, and what the table costs once open.
//
// The figures of the file come from our own walk over its records, those of the open table from the library: that the
// two agree on the number of rows is checked.
#include <algorithm>
#include <cstring>
#include <map>

#include <fmt/format.h>
#include <malloc.h>

#include "key_hash.h"
#include "place.h"
#include "registry.h"
#include "table_file.h"
#include "verbs.h"

namespace ktrg
{

namespace
{

struct figure {
    std::string name;
    cell        value;
    std::string note; // for people: behind the value
};

struct open_figures {
    std::uint64_t rows          = 0;
    std::uint64_t counter       = 0;
    std::uint64_t memory        = 0;
    std::uint64_t buckets       = 0;
    std::uint64_t longest_chain = 0;
};

std::uint64_t memory_in_use()
{
    const struct mallinfo2 info = mallinfo2();
    return info.uordblks + info.hblkhd;
}

// Opens the table as a hashed one and reads all its keys.
open_figures figures_of_open(const place & where, std::uint64_t expected_rows)
{
    open_figures        result;
    const std::uint64_t before = memory_in_use();
    const table         opened = table::open_for_reading(where, true);
    const std::uint64_t after  = memory_in_use();
    result.memory              = after > before ? after - before : 0;
    result.counter             = opened.counter();

    const column   key  = opened.columns().front();
    const key_hash hash = key_hash_for(key.type, expected_rows);
    result.buckets      = hash.buckets;
    row_values                           values({key});
    std::map<kt_uint32_t, std::uint64_t> chains;
    for (; opened.read(result.rows, values); result.rows++) {
        if (hash.buckets == 0)
            continue;
        kt_value_t   value   = values[0];
        void * const p_key   = is_indirect(key.type) ? static_cast<void *>(value.ptr_char) : &value;
        result.longest_chain = std::max(result.longest_chain, ++chains[hash.p_hash(p_key)]);
    }
    return result;
}

std::string share(std::uint64_t part, std::uint64_t whole)
{
    return whole == 0 ? "" : fmt::format("{:.1f} %", 100.0 * static_cast<double>(part) / static_cast<double>(whole));
}

std::vector<figure> figures_of(const place & where, const table_file & file, const open_figures & opened)
{
    const file_bytes & bytes  = file.bytes;
    const auto         number = [](std::uint64_t n) { return cell::of_number(n); };
    const auto         part   = [&](const char * p_name, std::uint64_t n) {
        return figure{p_name, number(n), share(n, file.length)};
    };
    std::vector<figure> figures = {
        {"table", cell::of_text(where.name), ""},
        {"key", cell::of_text(file.columns.front().name), ""},
        {"columns", number(file.columns.size()), ""},
        {"rows", number(file.rows), ""},
        {"counter", number(file.counter), ""},
        {"transactions", number(file.transactions), "in the file as it stands"},
        {"updates", number(file.updates), ""},
        {"deletions", number(file.deletions), ""},
        {"blob_bytes", file.has_blob ? number(file.blob_length) : cell{}, ""},
        {"file_bytes", number(file.length), ""},
        part("live_bytes", bytes.live()),
        part("live_metadata_bytes", bytes.metadata),
        part("live_row_bytes", bytes.live_rows),
        part("live_commit_bytes", bytes.live_commit),
        part("superseded_bytes", bytes.superseded()),
        part("superseded_row_bytes", bytes.superseded_rows),
        part("superseded_commit_bytes", bytes.superseded_commits),
        part("dead_bytes", bytes.dead()),
        part("dead_row_bytes", bytes.deleted_rows),
        part("dead_deletion_bytes", bytes.deletion_lists),
        part("dead_tail_bytes", bytes.behind_commit),
        {"memory_bytes", number(opened.memory), "once open, with an index of its keys"},
        {"hash_buckets", number(opened.buckets), ""},
        {"hash_longest_chain", number(opened.longest_chain), ""},
    };
    return figures;
}

void write_text(output_sink & sink, const output_style & style, const std::vector<figure> & figures)
{
    for (const figure & each : figures) {
        std::string name = each.name;
        std::replace(name.begin(), name.end(), '_', ' ');
        const std::string value = each.value.kind == cell_kind::missing ? "none" : each.value.text;
        const bool  part  = name.starts_with("live ") || name.starts_with("superseded ") || name.starts_with("dead ");
        const bool  inner = part && std::count(name.begin(), name.end(), ' ') > 1;
        std::string line  = fmt::format("{}{:<24}", inner ? "    " : part ? "  " : "", name);
        line.resize(std::max<std::size_t>(line.size(), 28), ' ');
        line += each.value.kind == cell_kind::text ? value : fmt::format("{:>12}", value);
        if (!each.note.empty() && value != "0")
            line += style.colour ? "  \x1b[2m" + each.note + "\x1b[0m" : "  " + each.note;
        sink.write(line + "\n");
    }
}

} // namespace

exit_code run_stat(const common_options & common, const table_options & options)
{
    const place        where  = find_place(options.table);
    const table_file   file   = read_table_file(where.file, where.name);
    const open_figures opened = figures_of_open(where, file.rows);
    if (opened.rows != file.rows && opened.counter == file.counter)
        throw failure(exit_code::damaged, where.name,
                      fmt::format("the file's records make {} rows, the open table has {}", file.rows, opened.rows));
    std::vector<figure> figures = figures_of(where, file, opened);
    output_sink         sink;
    if (!common.form.has_value()) {
        write_text(sink, common.style, figures);
    } else {
        const output_style         style  = common.style_or(output_form::line);
        const auto                 writer = make_row_writer(style, sink);
        std::vector<output_column> columns;
        std::vector<cell>          cells;
        for (figure & each : figures) {
            columns.push_back({each.name, each.value.kind != cell_kind::text});
            cells.push_back(std::move(each.value));
        }
        writer->begin(columns);
        writer->row(cells);
        writer->end();
    }
    sink.flush();
    return exit_code::done;
}

} // namespace ktrg
