// SPDX-License-Identifier: MIT
// durable: transactions of one row. How long a disk takes to sync changes from moment to moment, so the stores take turns
// after each transaction. In the same turns the machine makes the same system calls without a store.
#include <algorithm>

#include <fmt/format.h>

#include "common/machine.h"
#include "groups.h"

namespace peers
{

namespace
{

// A repetition has fewer transactions where one takes long.
constexpr double longest_repetition = 0.5;

// Does transaction n; delivers which row has which count from then on.
using transaction = std::function<change(contestant &, std::uint64_t)>;

// Seconds spent, and on how many transactions.
struct spent {
    double      seconds = 0;
    std::size_t times   = 0;

    template <class Action> void on(Action action)
    {
        seconds += seconds_of(clock_kind::wall, action);
        ++times;
    }
    [[nodiscard]] double nanoseconds_each() const { return seconds * 1e9 / static_cast<double>(times); }
};

// How many transactions of each store are in a repetition, after two that warm up.
std::map<contestant *, std::size_t> transactions_of(arena & a, std::uint64_t & n, const transaction & act)
{
    std::map<contestant *, std::size_t> all;
    a.each_loaded(0, [&](contestant & c) {
        act(c, n++);
        const double seconds = seconds_of(clock_kind::wall, [&] { act(c, n++); });
        all[&c]              = static_cast<std::size_t>(
            std::clamp(longest_repetition / seconds, 1.0, static_cast<double>(a.chosen().transactions)));
    });
    return all;
}

// One after the other each store makes one transaction, and the machine its pairs; so often.
void measure_repetition(arena & a, const char * p_workload, int repetition,
                        const std::map<contestant *, std::size_t> & transactions, std::uint64_t & n,
                        const transaction & act)
{
    std::map<contestant *, spent> stores;
    spent                         growing;
    spent                         kept;
    fsync_file                    file(a.directory() + "/machine");
    for (int i = 0; i < a.chosen().transactions; ++i) {
        a.each_loaded(repetition + i, [&](contestant & c) {
            if (stores[&c].times == transactions.at(&c))
                return;
            change expected{};
            stores[&c].on([&] { expected = act(c, n++); });
            require(c.p_store->read({&expected.id, 1}, field::count, scope::alone) == digest(expected.count),
                    fmt::format("{}: {} loses a transaction", c.p_kind->name, p_workload));
        });
        growing.on([&] { file.append_pair(); });
        kept.on([&] { file.overwrite_pair(); });
    }
    for (const auto & [p_contestant, time] : stores)
        a.add(p_workload, p_contestant->p_kind->name, time.nanoseconds_each());
    a.add("fsync_pair", machine, growing.nanoseconds_each());
    a.add("fsync_pair_kept", machine, kept.nanoseconds_each());
}

// n is another one for each transaction, and goes on.
void measure_durable(arena & a, const char * p_workload, std::uint64_t & n, const transaction & act)
{
    if (!a.wants({p_workload}))
        return;
    const auto transactions = transactions_of(a, n, act);
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition)
        measure_repetition(a, p_workload, repetition, transactions, n, act);
}

} // namespace

void run_durable(arena & a)
{
    if (!a.wants({"durable_insert", "durable_update", "durable_reopened"}))
        return;
    const transaction insert = [&](contestant & c, std::uint64_t n) {
        const row r = row_of(a.data().size() + n);
        c.p_store->insert({&r, 1});
        return change{r.id, r.count};
    };
    const transaction update = [&](contestant & c, std::uint64_t n) {
        const change to{a.data().ids()[n % a.data().size()], static_cast<std::int64_t>(1'000'000 + n)};
        c.p_store->update({&to, 1}); // never to what is there already, which some stores notice and leave
        return to;
    };
    std::uint64_t n = 0;
    a.load(layout::by_id);
    measure_durable(a, "durable_insert", n, insert);
    measure_durable(a, "durable_update", n, update);
    a.reopen(layout::by_id, access::write);
    measure_durable(a, "durable_reopened", n, update);
    a.clear();
}

} // namespace peers
