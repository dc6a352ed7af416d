// SPDX-License-Identifier: MIT
// reads: by key, in random order, going on where the last repetition ended, so that none finds its rows in a cache that
// it filled itself.
#include "reads.h"

#include <thread>

#include <fmt/format.h>

namespace peers
{

namespace
{

constexpr std::size_t reads_in_a_transaction = 1000;

// Reads `reads` times with keys from place `at` on, which moves on; and checks what was read.
template <class Key>
void read_some(const arena & a, store & s, std::span<const Key> keys, std::size_t & at, std::size_t reads, field wanted,
               scope transactions)
{
    while (reads > 0) {
        const std::size_t n = std::min({reads, reads_in_a_transaction, keys.size() - at});
        require(s.read(keys.subspan(at, n), wanted, transactions) == a.data().sum(wanted, at, n),
                "a read delivers something else than was stored");
        reads -= n;
        at = at + n == keys.size() ? 0 : at + n;
    }
}

template <class Key>
void measure_reads(arena & a, const std::string & workload, std::span<const Key> keys, field wanted)
{
    const auto measure = [&](const std::string & name, scope transactions) {
        a.measure_calls(name, 1, [&](contestant & c, std::size_t n) {
            read_some(a, *c.p_store, keys, c.at, n, wanted, transactions);
        });
    };
    measure(workload, scope::alone);
    measure(workload + "_tx", scope::together);
}

void measure_two_threads(arena & a, contestant & c, std::size_t reads)
{
    const std::unique_ptr<store> p_second = c.p_store->share();
    if (p_second == nullptr)
        return;
    std::size_t at       = 0;
    std::size_t at_other = a.data().size() / 2;
    const auto  read     = [&](store & s, std::size_t & from) {
        read_some(a, s, a.data().ids(), from, reads, field::count, scope::alone);
    };
    read(*p_second, at_other); // what it has to do once
    const double one = seconds_of(clock_kind::wall, [&] { read(*c.p_store, at); });
    const double two = seconds_of(clock_kind::wall, [&] {
        std::thread other([&] { read(*p_second, at_other); });
        read(*c.p_store, at);
        other.join();
    });
    a.add("two_threads", c.p_kind->name, two * 1e9 / static_cast<double>(2 * reads));
    a.add("two_threads_gain", c.p_kind->name, 2 * one / two);
}

} // namespace

void measure_reads_by_id(arena & a)
{
    measure_reads(a, "read_int", a.data().ids(), field::count);
    measure_reads(a, "read_text", a.data().ids(), field::note);
}

void measure_reads_by_two(arena & a)
{
    if (!a.wants({"two_threads", "two_threads_gain"}))
        return;
    std::map<const contestant *, std::size_t> reads;
    a.each_loaded(0, [&](contestant & c) {
        const double one = seconds_of(
            clock_kind::wall, [&] { read_some(a, *c.p_store, a.data().ids(), c.at, 100, field::count, scope::alone); });
        reads[&c] = std::max<std::size_t>(100, static_cast<std::size_t>(2 * a.chosen().slice / (one / 100)));
    });
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition)
        a.each_loaded(repetition, [&](contestant & c) { measure_two_threads(a, c, reads[&c]); });
}

void run_by_name(arena & a)
{
    if (a.wants({"name_int", "name_int_tx", "name_text", "name_text_tx"})) {
        a.load(layout::by_name);
        a.reopen(layout::by_name);
        measure_reads(a, "name_int", a.data().names(), field::count);
        measure_reads(a, "name_text", a.data().names(), field::note);
    }
    if (a.wants({"index_int", "index_int_tx", "index_text", "index_text_tx"})) {
        a.load(layout::by_id_and_name);
        a.reopen(layout::by_id_and_name);
        measure_reads(a, "index_int", a.data().names(), field::count);
        measure_reads(a, "index_text", a.data().names(), field::note);
    }
    a.clear();
}

} // namespace peers
