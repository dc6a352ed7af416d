// SPDX-License-Identifier: MIT
// growth: what each exported call costs as a table grows, on fresh tables and on tables that have been worked on.
//
// docs/PERFORMANCE.md tells how it is measured. The program refuses to run if its curves leave an exported function out.
#include <cstdlib>
#include <exception>
#include <filesystem>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "common/machine.h"
#include "common/require.h"
#include "groups.h"
#include "report.h"

namespace growth
{

namespace
{

struct outputs {
    std::string csv;
    std::string markdown;
    std::string svg;
};

// A directory of this run, removed in the end.
class own_directory
{
  public:
    explicit own_directory(const std::string & parent)
    {
        std::filesystem::create_directories(parent);
        path_ = parent + "/growth.XXXXXX";
        require(mkdtemp(path_.data()) != nullptr, "can't make a directory in " + parent);
    }
    ~own_directory()
    {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    own_directory(const own_directory &)             = delete;
    own_directory & operator=(const own_directory &) = delete;

    [[nodiscard]] const std::string & path() const { return path_; }

  private:
    std::string path_;
};

void tell(const run & r, const char * p_what, double seconds)
{
    fmt::print(stderr, "growth: {} rows: {}, {:.1f} s\n", r.rows(), p_what, seconds);
}

void measure_in_memory(run & r, state s)
{
    if (!r.wants_any_of({family::reads, family::changes, family::calls, family::rows, family::columns}))
        return;
    tell(r, name_of(s).data(), seconds_of(clock_kind::wall, [&] {
             table_in_memory t(r.rows(), s, true);
             measure_reads(r, t);
             measure_calls(r, t);
             measure_settings(r, t);
             measure_rows(r, t);
             measure_packed(r, t);
             measure_columns(r, t);
             settle_heap();
             measure_transactions(r, t);
         }));
}

// A row that takes a free slot can be refused where there is no hash table (docs/ODDITIES.md), so that such a table
// isn't churned.
void measure_plain(run & r)
{
    if (!r.wants("get_field_by_key, no hash") && !r.wants("add_row, no hash") &&
        !r.wants("get_duplicate_rows, no hash"))
        return;
    tell(r, "without a hash table", seconds_of(clock_kind::wall, [&] {
             table_in_memory t(r.rows(), state::fresh, false);
             measure_without_hash(r, t);
         }));
}

void check_nothing_is_missing(const figures & all, const run & r)
{
    for (const curve & c : curves())
        require(!r.wants(c.name) || !all.states_of(c.name).empty(), fmt::format("\"{}\" wasn't measured", c.name));
}

// A file whose directory lacks would be noticed too late.
void make_directories(const outputs & to)
{
    for (const std::string & file : {to.csv, to.markdown})
        if (const auto directory = std::filesystem::path(file).parent_path(); !directory.empty())
            std::filesystem::create_directories(directory);
}

void measure(options o, const outputs & to, const std::string & command)
{
    make_directories(to);
    const own_directory directory(o.directory);
    o.directory = directory.path();
    if (lies_in_memory(o.directory))
        fmt::print(stderr, "growth: {} has no disk below it: what is durable there costs nothing\n", o.directory);
    figures all;
    run     r(o, all);
    for (const std::size_t rows : o.sizes) {
        r.begin(rows);
        measure_machine(r);
        measure_in_memory(r, state::fresh);
        measure_in_memory(r, state::churned);
        measure_plain(r);
        tell(r, "files", seconds_of(clock_kind::wall, [&] { measure_files(r); }));
    }
    print_table(all);
    if (!to.csv.empty())
        write_csv(all, to.csv);
    if (!to.markdown.empty())
        write_markdown(all, to.markdown, command);
    if (!to.svg.empty())
        write_charts(all, to.svg);
    check_nothing_is_missing(all, r);
}

void list()
{
    for (const curve & c : curves())
        fmt::print("{:<34}{:<14}{}\n", c.name, c.per, c.functions);
}

// Short enough to see that everything works; the figures are rough.
void be_quick(options & o)
{
    o.sizes          = {1'000, 4'000, 16'000};
    o.repeat         = 2;
    o.slice          = 0.002;
    o.share          = 0.02;
    o.transactions   = 2;
    o.batch          = 200;
    o.most_versioned = 4'000;
    o.most_dumped    = 1'000;
}

std::string command_of(int argc, char ** p_argv)
{
    std::string command = "build/bin/growth";
    for (int i = 1; i < argc; ++i)
        command += fmt::format(" {}", p_argv[i]);
    return command;
}

int main_with(int argc, char ** p_argv)
{
    options o;
    outputs to;
    bool    quick = false;
    bool    lists = false;
    o.directory   = GROWTH_DIRECTORY;

    std::vector<std::size_t> sizes;
    int                      repeat = 0;
    CLI::App                 app("Measures what each exported call costs as a table grows.");
    app.add_option("--dir", o.directory, "where files are made: on a real file system")->capture_default_str();
    app.add_option("--rows", sizes, "sizes, ascending")->delimiter(',')->check(CLI::Range(1'000, 50'000'000));
    app.add_option("--only", o.only, "only the curves whose names have one of these in them")->delimiter(';');
    app.add_option("--repeat", repeat, "repetitions of what is short")->check(CLI::Range(1, 1000));
    app.add_option("--share", o.share, "seconds that a call on all rows is repeated for")->capture_default_str();
    app.add_flag("--quick", quick, "small and rough");
    app.add_flag("--list", lists, "tell the curves");
    app.add_option("--csv", to.csv, "write the figures to this file");
    app.add_option("--markdown", to.markdown, "write docs/performance/growth.md to this file");
    app.add_option("--svg", to.svg, "draw the charts in this directory");
    CLI11_PARSE(app, argc, p_argv);

    check_names();
    if (lists)
        return list(), 0;
    if (quick)
        be_quick(o);
    if (!sizes.empty())
        o.sizes = sizes;
    if (repeat > 0)
        o.repeat = repeat;
    measure(o, to, command_of(argc, p_argv));
    return 0;
}

} // namespace

} // namespace growth

int main(int argc, char ** p_argv)
{
    try {
        return growth::main_with(argc, p_argv);
    } catch (const std::exception & e) {
        fmt::print(stderr, "growth: {}\n", e.what());
        return 1;
    }
}
