// SPDX-License-Identifier: MIT
// by_id: what is measured on one load of rows that lie under their ids. Nothing changes them.
#include <fmt/format.h>

#include "disk.h"
#include "groups.h"
#include "memory.h"
#include "reads.h"

namespace peers
{

namespace
{

void measure_counts(arena & a, const char * p_workload, filter wanted)
{
    const std::size_t expected = a.data().matching(wanted);
    a.measure_calls(p_workload, a.data().size(), [&](contestant & c, std::size_t n) {
        for (; n > 0; --n)
            require(c.p_store->count(wanted) == expected,
                    fmt::format("{}: {} counts wrongly", c.p_kind->name, p_workload));
    });
}

// The copy is checked and given up outside the time.
void measure_copies(arena & a, const char * p_workload, filter wanted)
{
    if (!a.wants({p_workload}))
        return;
    const std::size_t   rows     = a.data().matching(wanted);
    const std::uint64_t expected = a.data().digest_of(wanted);
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition)
        a.each_loaded(repetition, [&](contestant & c) {
            std::size_t copied = 0;
            a.time(p_workload, c, clock_kind::processor, a.data().size(), [&] { copied = c.p_store->copy(wanted); });
            require(c.p_store->drop_copy() == expected && copied == rows,
                    fmt::format("{}: {} copies something else", c.p_kind->name, p_workload));
        });
}

void measure_scans(arena & a)
{
    measure_counts(a, "scan_count_1", filter::one_percent);
    measure_counts(a, "scan_count_50", filter::half);
    measure_counts(a, "scan_three", filter::three_conditions);
    measure_copies(a, "scan_copy_1", filter::one_percent);
    measure_copies(a, "scan_copy_50", filter::half);
}

// Opening takes what the other stores leave of the caches, so the page cache is all that is warm.
void measure_opening(arena & a)
{
    if (!a.wants({"open_one", "open_all"}))
        return;
    const std::uint64_t all = a.data().digest_of(filter::everything);
    for (int repetition = 0; repetition < a.chosen().repeat; ++repetition)
        a.each_loaded(repetition, [&](contestant & c) {
            const auto    id  = a.data().ids().first(1);
            std::uint64_t sum = 0;
            a.time("open_one", c, clock_kind::wall, 1, [&] {
                c.p_store = c.p_kind->open(a.place_of(c, layout::by_id), access::read);
                sum       = c.p_store->read(id, field::count, scope::alone);
            });
            require(sum == a.data().sum(field::count, 0, 1), fmt::format("{}: open_one reads wrongly", c.p_kind->name));
            c.p_store.reset();
            a.time("open_all", c, clock_kind::wall, a.data().size(), [&] {
                c.p_store = c.p_kind->open(a.place_of(c, layout::by_id), access::read);
                sum       = c.p_store->read_all();
            });
            require(sum == all, fmt::format("{}: open_all reads wrongly", c.p_kind->name));
            c.p_store.reset();
        });
}

void measure_memory(arena & a)
{
    if (!a.wants({"memory_private", "memory_peak"}))
        return;
    a.each_loaded(0, [&](contestant & c) {
        const memory_figures bytes = memory_of_child(c.p_kind->name, a.place_of(c, layout::by_id));
        a.add("memory_private", c.p_kind->name, bytes.own / static_cast<double>(a.data().size()));
        a.add("memory_peak", c.p_kind->name, bytes.peak / static_cast<double>(a.data().size()));
    });
}

} // namespace

void run_by_id(arena & a)
{
    if (!a.wants({"read_int", "read_int_tx", "read_text", "read_text_tx", "two_threads", "two_threads_gain",
                  "scan_count_1", "scan_count_50", "scan_three", "scan_copy_1", "scan_copy_50", "open_one", "open_all",
                  "memory_private", "memory_peak", "disk_loaded"}))
        return;
    a.load(layout::by_id);
    a.reopen(layout::by_id);
    measure_reads_by_id(a);
    measure_reads_by_two(a);
    measure_scans(a);
    a.close();
    measure_disk(a, "disk_loaded");
    measure_opening(a);
    measure_memory(a);
    a.clear();
}

} // namespace peers
