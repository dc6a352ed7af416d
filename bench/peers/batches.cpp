// SPDX-License-Identifier: MIT
// batches: transactions of many rows. Each repetition makes the store anew, fills it, updates every row, and deletes
// what is there in three steps.
#include <fmt/format.h>

#include "groups.h"

namespace peers
{

namespace
{

constexpr std::size_t keys_deleted = 100;

void require_rows(contestant & c, filter wanted, std::size_t rows)
{
    const std::size_t counted = c.p_store->count(wanted);
    require(counted == rows, fmt::format("{}: {} rows are there instead of {}", c.p_kind->name, counted, rows));
}

// The counts of the rows after their update, read back.
void require_updated(contestant & c, std::span<const change> changes)
{
    const std::size_t          some = std::min<std::size_t>(changes.size(), 1000);
    std::vector<std::uint64_t> ids;
    std::uint64_t              sum = 0;
    for (const change & change : changes.first(some)) {
        ids.push_back(change.id);
        sum += digest(change.count);
    }
    require(c.p_store->read(ids, field::count, scope::together) == sum,
            fmt::format("{}: an update is lost", c.p_kind->name));
}

void run_cycle(arena & a, contestant & c, std::span<const change> changes)
{
    const std::size_t rows = a.data().size();
    a.open_fresh(c, layout::by_id);
    a.time("batch_insert", c, clock_kind::wall, rows, [&] { c.p_store->insert(a.data().rows()); });
    require_rows(c, filter::half, rows / 2);

    a.time("batch_update", c, clock_kind::wall, rows, [&] { c.p_store->update(changes); });
    require_updated(c, changes);

    const auto ids = a.data().ids().first(keys_deleted);
    a.time("delete_keys", c, clock_kind::wall, keys_deleted, [&] { c.p_store->erase(ids); });
    require_rows(c, filter::everything, rows - keys_deleted);

    const std::size_t half = c.p_store->count(filter::half);
    a.time("delete_half", c, clock_kind::wall, half, [&] { c.p_store->erase(filter::half); });
    require_rows(c, filter::half, 0);

    const std::size_t rest = rows - keys_deleted - half;
    require_rows(c, filter::everything, rest);
    a.time("delete_all", c, clock_kind::wall, rest, [&] { c.p_store->erase_all(); });
    require_rows(c, filter::everything, 0);
    c.p_store.reset();
}

} // namespace

void run_batches(arena & a)
{
    if (!a.wants({"batch_insert", "batch_update", "delete_keys", "delete_half", "delete_all"}))
        return;
    const std::vector<change> changes = a.data().changes(1);
    a.repeat_long("a cycle of batches", [&](contestant & c) { run_cycle(a, c, changes); });
    a.clear();
}

} // namespace peers
