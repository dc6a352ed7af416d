// SPDX-License-Identifier: MIT
// columns: a column added to a full table, and dropped again.
#include <fmt/format.h>

#include "groups.h"

namespace peers
{

void run_columns(arena & a)
{
    if (!a.wants({"add_column", "drop_column"}))
        return;
    const std::size_t   rows = a.data().size();
    const std::uint64_t all  = a.data().digest_of(filter::everything);
    a.load(layout::by_id);
    a.reopen(layout::by_id, access::write);
    a.repeat_long("adding and dropping a column", [&](contestant & c) {
        if (!c.loaded)
            return;
        a.time("add_column", c, clock_kind::wall, rows, [&] { c.p_store->add_column(); });
        require(c.p_store->sum_added() == rows * added_default && c.p_store->read_all() == all,
                fmt::format("{}: a column was added wrongly", c.p_kind->name));
        a.time("drop_column", c, clock_kind::wall, rows, [&] { c.p_store->drop_column(); });
        require(c.p_store->read_all() == all, fmt::format("{}: a column was dropped wrongly", c.p_kind->name));
    });
    a.clear();
}

} // namespace peers
