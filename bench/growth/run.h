// SPDX-License-Identifier: MIT
// run: how things are timed, and for how long.
//
// Calls that are short fill a slice of time, a few slices a point; calls that work on the whole table are repeated until
// they have had their share of time, and once at least. What stands is the median.
#ifndef GROWTH_RUN_H
#define GROWTH_RUN_H

#include <algorithm>
#include <cstddef>
#include <set>
#include <string>
#include <vector>

#include "common/clock.h"
#include "common/machine.h"
#include "figures.h"

namespace growth
{

struct options {
    std::string              directory;
    std::vector<std::size_t> sizes{1'000, 4'000, 16'000, 64'000, 256'000, 1'000'000, 4'000'000};
    std::vector<std::string> only;                     // parts of curves' names; empty: all
    int                      repeat         = 5;       // slices a point, and batches of changes
    double                   slice          = 0.01;    // seconds
    double                   share          = 0.4;     // seconds that a call on all rows is repeated for
    int                      transactions   = 15;      // durable ones a repetition
    std::size_t              batch          = 1'000;   // rows changed in a transaction in memory
    std::size_t              most_versioned = 256'000; // rows of a file with ten versions of each
    std::size_t              most_dumped    = 64'000;  // rows of a table that is dumped
};

class run
{
  public:
    run(options o, figures & all) : options_(std::move(o)), figures_(all) {}

    void begin(std::size_t rows) { rows_ = rows; }

    [[nodiscard]] const options & chosen() const { return options_; }
    [[nodiscard]] std::size_t     rows() const { return rows_; }

    [[nodiscard]] bool wants(std::string_view curve) const
    {
        return options_.only.empty() || std::any_of(options_.only.begin(), options_.only.end(), [&](const auto & part) {
                   return curve.find(part) != std::string_view::npos;
               });
    }
    [[nodiscard]] bool wants_any_of(std::initializer_list<family> families) const
    {
        return std::any_of(families.begin(), families.end(), [&](family f) {
            return std::any_of(curves().begin(), curves().end(),
                               [&](const curve & c) { return c.in == f && wants(c.name); });
        });
    }

    void add(std::string_view name, state s, double nanoseconds)
    {
        if (wants(name) || curve_of(name).in == family::machine)
            figures_.add(name, s, rows_, nanoseconds);
    }

    // Times one action; adds what it cost for each of its units. Delivers the seconds.
    template <class Action> double time(std::string_view name, state s, std::size_t units, Action action)
    {
        const double seconds = seconds_of(curve_of(name).clock, action);
        add(name, s, seconds * 1e9 / static_cast<double>(units));
        return seconds;
    }

    // Times one action that syncs, and behind it the system calls that a transaction of one row makes: what a sync takes
    // changes from moment to moment.
    template <class Action> void time_synced(std::string_view name, state s, fsync_file & disk, Action action)
    {
        if (!wants(name))
            return;
        const double seconds = time(name, s, 1, action);
        const double pair    = seconds_of(clock_kind::wall, [&] { disk.append_pair(); });
        figures_.add("fsync pair", s, rows_, pair * 1e9);
        figures_.add_pairs(name, s, rows_, seconds / pair);
    }

    // Times call(), which is short, many times over.
    template <class Call> void measure_call(std::string_view name, state s, Call call)
    {
        if (!wants(name))
            return;
        const clock_kind clock = curve_of(name).clock;
        const auto       times = [&](std::size_t n) {
            return seconds_of(clock, [&] {
                for (std::size_t i = 0; i < n; ++i)
                    call();
            });
        };
        std::size_t n = 1;
        double      seconds;
        while ((seconds = times(n)) < options_.slice / 8)
            n *= 4;
        n = std::max<std::size_t>(1, static_cast<std::size_t>(static_cast<double>(n) * options_.slice / seconds));
        for (int i = 0; i < options_.repeat; ++i)
            add(name, s, times(n) * 1e9 / static_cast<double>(n));
    }

    // Repeats action(), which times something long, until it has had its share: three times at least, unless that takes
    // several shares.
    template <class Action> void repeat_long(Action action)
    {
        const double start = seconds_now(clock_kind::wall);
        for (int i = 0; i < 2 * options_.repeat; ++i) {
            action();
            const double spent = seconds_now(clock_kind::wall) - start;
            if (spent > 5 * options_.share || (i >= 2 && spent > options_.share))
                return;
        }
    }

    // The same for a call that can be repeated as it stands, once for each row.
    template <class Action, class After> void measure_rows(std::string_view name, state s, Action action, After after)
    {
        if (wants(name))
            repeat_long([&] {
                time(name, s, rows_, action);
                after();
            });
    }
    template <class Action> void measure_rows(std::string_view name, state s, Action action)
    {
        measure_rows(name, s, action, [] {});
    }

  private:
    options     options_;
    figures &   figures_;
    std::size_t rows_ = 0;
};

} // namespace growth

#endif
