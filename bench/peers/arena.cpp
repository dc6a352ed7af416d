// SPDX-License-Identifier: MIT
#include "arena.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>

#include <fmt/format.h>

namespace peers
{

namespace
{

// Seconds behind which a store begins no other repetition of what takes long: that varies less from time to time.
constexpr double longest_repetitions = 12;

bool contains(const std::vector<std::string> & list, std::string_view name)
{
    return std::find(list.begin(), list.end(), name) != list.end();
}

// How often to call so that a slice is filled.
std::size_t calls_in(double slice, const std::function<void(std::size_t)> & call)
{
    for (std::size_t calls = 1;; calls *= 4) {
        const double seconds = seconds_of(clock_kind::processor, [&] { call(calls); });
        if (seconds >= slice / 8)
            return std::max<std::size_t>(1, static_cast<std::size_t>(static_cast<double>(calls) * slice / seconds));
    }
}

} // namespace

arena::arena(options o, results & figures) : options_(std::move(o)), results_(figures)
{
    std::filesystem::create_directories(options_.directory);
    directory_ = options_.directory + "/peers.XXXXXX";
    require(mkdtemp(directory_.data()) != nullptr, "can't make a directory in " + options_.directory);
    for (const store_kind & kind : store_kinds())
        if (options_.stores.empty() || contains(options_.stores, kind.name))
            contestants_.push_back({&kind, directory_ + "/" + kind.name, nullptr});
}

arena::~arena()
{
    contestants_.clear();
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
}

bool arena::wants(std::initializer_list<std::string_view> workloads) const
{
    return options_.workloads.empty() || std::any_of(workloads.begin(), workloads.end(), [this](std::string_view name) {
               return contains(options_.workloads, name);
           });
}

void arena::load(layout found_by)
{
    clear();
    const std::string what = found_by == layout::by_id     ? "loading"
                             : found_by == layout::by_name ? "loading by name"
                                                           : "loading with an index";
    for (contestant & c : contestants_) {
        if (!expects_in_time(c, what))
            continue;
        took(c, what, seconds_of(clock_kind::wall, [&] {
                 open_fresh(c, found_by);
                 c.p_store->insert(p_data_->rows());
             }));
        c.loaded = true;
    }
}

void arena::reopen(layout found_by, access how)
{
    close();
    each_loaded(0, [&](contestant & c) { c.p_store = c.p_kind->open(place_of(c, found_by), how); });
}

void arena::close()
{
    for (contestant & c : contestants_)
        c.p_store.reset();
}

void arena::clear()
{
    close();
    for (contestant & c : contestants_) {
        std::filesystem::remove_all(c.directory);
        c.loaded = false;
    }
}

void arena::open_fresh(contestant & c, layout found_by)
{
    c.p_store.reset();
    c.at = 0;
    std::filesystem::remove_all(c.directory);
    std::filesystem::create_directories(c.directory);
    c.p_store = c.p_kind->open(place_of(c, found_by), access::create);
}

place arena::place_of(const contestant & c, layout found_by) const
{
    return {c.directory, found_by, p_data_->size()};
}

bool arena::expects_in_time(const contestant & c, const std::string & what)
{
    const history & past = histories_[{c.p_kind->name, what}];
    if (past.empty())
        return true;
    const auto [rows, seconds] = past.back();
    double power               = 1; // of the growth: 1 if time goes with the rows
    if (past.size() > 1) {
        const auto [rows_before, seconds_before] = past[past.size() - 2];
        power =
            std::log(seconds / seconds_before) / std::log(static_cast<double>(rows) / static_cast<double>(rows_before));
    }
    if (power > 1.2)
        power = std::max(power, 2.0); // a square, of which what costs the same at every size hides some
    const double growth   = static_cast<double>(p_data_->size()) / static_cast<double>(rows);
    const double expected = seconds * std::pow(growth, power);
    if (expected <= options_.patience)
        return true;
    results_.note(fmt::format("{}: left out at {} rows: {} took {:.2g} s with {} and would take about {:.2g} s",
                              c.p_kind->name, p_data_->size(), what, seconds, rows, expected));
    return false;
}

void arena::took(const contestant & c, const std::string & what, double seconds)
{
    history & past = histories_[{c.p_kind->name, what}];
    if (!past.empty() && past.back().first == p_data_->size())
        past.back().second = std::max(past.back().second, seconds);
    else
        past.emplace_back(p_data_->size(), seconds);
}

void arena::repeat_long(const std::string & what, const std::function<void(contestant &)> & action)
{
    std::map<const contestant *, double> spent;
    for (int repetition = 0; repetition < options_.repeat; ++repetition)
        each(repetition, [&](contestant & c) {
            if (spent[&c] > longest_repetitions || !expects_in_time(c, what))
                return;
            const double seconds = seconds_of(clock_kind::wall, [&] { action(c); });
            took(c, what, seconds);
            spent[&c] += seconds;
        });
}

void arena::each(int repetition, const std::function<void(contestant &)> & action)
{
    const std::size_t total = contestants_.size();
    for (std::size_t i = 0; i < total; ++i)
        action(contestants_[(i + static_cast<std::size_t>(repetition)) % total]);
}

void arena::each_loaded(int repetition, const std::function<void(contestant &)> & action)
{
    each(repetition, [&](contestant & c) {
        if (c.loaded)
            action(c);
    });
}

void arena::add(std::string_view workload, std::string_view store, double value)
{
    if (wants({workload}))
        results_.add(p_data_->size(), workload, store, value);
}

void arena::measure_calls(std::string_view workload, std::size_t units,
                          const std::function<void(contestant &, std::size_t)> & call)
{
    if (!wants({workload}))
        return;
    std::map<const contestant *, std::size_t> calls;
    each_loaded(0, [&](contestant & c) { calls[&c] = calls_in(options_.slice, [&](std::size_t n) { call(c, n); }); });
    for (int repetition = 0; repetition < options_.repeat; ++repetition)
        each_loaded(repetition, [&](contestant & c) {
            const std::size_t n = calls[&c];
            time(workload, c, clock_kind::processor, n * units, [&] { call(c, n); });
        });
}

} // namespace peers
