// SPDX-License-Identifier: MIT
// disk: what is on the disk, and what is there after many updates.
#include "disk.h"

#include <sys/stat.h>

#include <fmt/format.h>

namespace peers
{

namespace
{

// The blocks that a directory takes.
double bytes_on_disk(const std::string & directory)
{
    blkcnt_t blocks = 0;
    for (const auto & entry : std::filesystem::recursive_directory_iterator(directory)) {
        struct stat status;
        if (entry.is_regular_file() && stat(entry.path().c_str(), &status) == 0)
            blocks += status.st_blocks;
    }
    return static_cast<double>(blocks) * 512;
}

constexpr int rounds = 10;

// Ten transactions that each update every row; between two of them the store is opened anew if `reopened`.
void update_rounds(arena & a, contestant & c, bool reopened)
{
    for (int round = 1; round <= rounds; ++round) {
        if (reopened) {
            c.p_store.reset();
            c.p_store = c.p_kind->open(a.place_of(c, layout::by_id), access::write);
        }
        c.p_store->update(a.data().changes(round));
    }
    require(c.p_store->count(filter::half) == a.data().size() / 2, fmt::format("{}: updates are lost", c.p_kind->name));
}

void measure_updated(arena & a, const char * p_workload, bool reopened)
{
    if (!a.wants({p_workload}))
        return;
    a.load(layout::by_id);
    a.each_loaded(0, [&](contestant & c) {
        c.loaded = a.expects_in_time(c, p_workload);
        if (c.loaded)
            a.took(c, p_workload, seconds_of(clock_kind::wall, [&] { update_rounds(a, c, reopened); }));
    });
    a.close();
    measure_disk(a, p_workload);
    a.clear();
}

} // namespace

void measure_disk(arena & a, const char * p_workload)
{
    a.each_loaded(0, [&](contestant & c) {
        a.add(p_workload, c.p_kind->name, bytes_on_disk(c.directory) / static_cast<double>(a.data().size()));
    });
}

void run_updated(arena & a)
{
    if (a.data().size() > a.chosen().most_updated)
        return;
    measure_updated(a, "disk_updated", false);
    measure_updated(a, "disk_reopened", true);
}

} // namespace peers
