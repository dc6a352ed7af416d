// SPDX-License-Identifier: MIT
// peers: this library beside other embedded stores: the same rows, the same workloads, one run.
//
// docs/PERFORMANCE.md tells what each workload means and how each store is configured. Every answer of every store is
// checked. Compare stores within one run, by their medians.
#include <exception>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "charts.h"
#include "common/machine.h"
#include "groups.h"
#include "memory.h"
#include "report.h"
#include "workloads.h"

namespace peers
{

namespace
{

struct outputs {
    std::string csv;
    std::string markdown;
    std::string svg;
};

struct group {
    const char * name;
    void (*run)(arena &);
};

constexpr group groups[] = {
    {"the machine", run_machine_limits},
    {"transactions of one row", run_durable},
    {"batches", run_batches},
    {"by id", run_by_id},
    {"by name", run_by_name},
    {"columns", run_columns},
    {"updates", run_updated},
};

// A file whose directory lacks would be noticed too late.
void make_directories(const outputs & to)
{
    for (const std::string & file : {to.csv, to.markdown})
        if (const auto directory = std::filesystem::path(file).parent_path(); !directory.empty())
            std::filesystem::create_directories(directory);
}

void run(const options & o, const outputs & to)
{
    make_directories(to);
    if (lies_in_memory(o.directory))
        fmt::print(stderr, "peers: {} has no disk below it: what is durable there costs nothing\n", o.directory);
    results figures;
    arena   a(o, figures);
    for (const std::size_t size : o.sizes) {
        const data_set data(size);
        a.begin(data);
        for (const group & g : groups) {
            const double seconds = seconds_of(clock_kind::wall, [&] { g.run(a); });
            if (seconds > 0.05) // else nothing of it was asked for
                fmt::print(stderr, "peers: {} rows: {}, {:.1f} s\n", size, g.name, seconds);
        }
    }
    print_table(figures);
    if (!to.csv.empty())
        write_csv(figures, to.csv);
    if (!to.markdown.empty())
        write_markdown(figures, to.markdown);
    if (!to.svg.empty())
        write_charts(figures, to.svg);
}

void list()
{
    for (const store_kind & kind : store_kinds())
        fmt::print("{:<18}{}\n", kind.name, kind.description);
    fmt::print("\n");
    for (const workload & w : workloads())
        fmt::print("{:<18}{}{}{}\n", w.name, w.meaning, *w.per != '\0' ? "; per " : "", w.per);
    for (const workload & w : machine_limits())
        fmt::print("{:<18}{}\n", w.name, w.meaning);
}

template <class Named> std::vector<std::string> names_of(std::span<const Named> all)
{
    std::vector<std::string> names;
    for (const Named & named : all)
        names.emplace_back(named.name);
    return names;
}

std::vector<std::string> workload_names()
{
    std::vector<std::string> names = names_of(workloads());
    for (const std::string & limit : names_of(machine_limits()))
        names.push_back(limit);
    return names;
}

// Short enough to see that everything works; the figures are rough.
void be_quick(options & o)
{
    o.sizes        = {1'000, 10'000};
    o.repeat       = 3;
    o.slice        = 0.005;
    o.transactions = 10;
    o.most_updated = 1'000;
}

int main_with(int argc, char ** p_argv)
{
    options     o;
    outputs     to;
    bool        quick = false;
    bool        lists = false;
    std::string memory_of;
    o.directory = PEERS_DIRECTORY;

    std::vector<std::size_t> sizes;
    int                      repeat = 0;
    CLI::App                 app("Measures this library beside other embedded stores.");
    app.add_option("--dir", o.directory, "where the stores are made: on a real file system")->capture_default_str();
    app.add_option("--rows", sizes, "sizes")->delimiter(',')->check(CLI::Range(1'000, 50'000'000));
    app.add_option("--stores", o.stores, "only these stores")
        ->delimiter(',')
        ->check(CLI::IsMember(names_of(store_kinds())));
    app.add_option("--workloads", o.workloads, "only these workloads")
        ->delimiter(',')
        ->check(CLI::IsMember(workload_names()));
    app.add_option("--repeat", repeat, "repetitions")->check(CLI::Range(1, 1000));
    app.add_option("--patience", o.patience, "leave out a store that would take more seconds for something long");
    app.add_flag("--quick", quick, "small and rough");
    app.add_flag("--list", lists, "tell the stores and workloads");
    app.add_option("--csv", to.csv, "write the figures to this file");
    app.add_option("--markdown", to.markdown, "write the tables of docs/PERFORMANCE.md to this file");
    app.add_option("--svg", to.svg, "draw the charts in this directory");
    app.add_option("--memory-of", memory_of)->group("");
    CLI11_PARSE(app, argc, p_argv);

    if (lists)
        return list(), 0;
    if (!memory_of.empty())
        return be_the_child(memory_of, {o.directory, layout::by_id, sizes.at(0)}), 0;
    if (quick)
        be_quick(o);
    if (!sizes.empty())
        o.sizes = sizes;
    if (repeat > 0)
        o.repeat = repeat;
    run(o, to);
    return 0;
}

} // namespace

} // namespace peers

int main(int argc, char ** p_argv)
{
    try {
        return peers::main_with(argc, p_argv);
    } catch (const std::exception & e) {
        fmt::print(stderr, "peers: {}\n", e.what());
        return 1;
    }
}
