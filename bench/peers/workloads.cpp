// SPDX-License-Identifier: MIT
#include "workloads.h"

namespace peers
{

namespace
{

constexpr workload all[] = {
    {"durable_insert", unit::nanoseconds, "transaction", "one row inserted in a durable transaction of its own"},
    {"durable_update", unit::nanoseconds, "transaction",
     "one field of one row set in a durable transaction of its own"},
    {"durable_reopened", unit::nanoseconds, "transaction", "durable_update after the store was closed and opened"},
    {"batch_insert", unit::nanoseconds, "row", "all rows inserted in one transaction"},
    {"batch_update", unit::nanoseconds, "row",
     "one field of every row set by key, in random order, in one transaction"},
    {"delete_keys", unit::nanoseconds, "row", "100 rows deleted by key in one transaction"},
    {"delete_half", unit::nanoseconds, "row deleted",
     "the half of the rows that matches a predicate deleted in one transaction"},
    {"delete_all", unit::nanoseconds, "row deleted",
     "the other half, then all that there is, deleted in one transaction"},
    {"read_int", unit::nanoseconds, "read", "an integer read by integer key, each read a transaction of its own"},
    {"read_int_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"read_text", unit::nanoseconds, "read",
     "a string of 40 bytes read by integer key, each read a transaction of its own"},
    {"read_text_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"name_int", unit::nanoseconds, "read", "an integer read by string key, each read a transaction of its own"},
    {"name_int_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"name_text", unit::nanoseconds, "read",
     "a string of 40 bytes read by string key, each read a transaction of its own"},
    {"name_text_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"index_int", unit::nanoseconds, "read",
     "an integer read by a second, string key of rows that lie under an integer key"},
    {"index_int_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"index_text", unit::nanoseconds, "read", "a string of 40 bytes read by such a second key"},
    {"index_text_tx", unit::nanoseconds, "read", "the same, a thousand reads in one transaction"},
    {"two_threads", unit::nanoseconds, "read", "read_int by two threads at once: wall time over all reads"},
    {"two_threads_gain", unit::times, "", "the rate of two threads over that of one"},
    {"scan_count_1", unit::nanoseconds, "row scanned", "the rows that match counted, a hundredth of them: count < 10"},
    {"scan_count_50", unit::nanoseconds, "row scanned", "half of the rows: count < 500"},
    {"scan_three", unit::nanoseconds, "row scanned",
     "count > 499 and name like 'ab%' and ratio < 0.99 counted: a quarter of the rows"},
    {"scan_copy_1", unit::nanoseconds, "row scanned", "a hundredth of the rows found and copied into memory"},
    {"scan_copy_50", unit::nanoseconds, "row scanned", "half of the rows found and copied into memory"},
    {"add_column", unit::nanoseconds, "row", "an integer column with a default value added to a full table"},
    {"drop_column", unit::nanoseconds, "row", "that column dropped"},
    {"open_one", unit::nanoseconds, "open", "the store opened and the count of one row read by key"},
    {"open_all", unit::nanoseconds, "row", "the store opened and all fields of all rows read"},
    {"memory_private", unit::bytes, "row", "private memory once opened and all rows read"},
    {"memory_peak", unit::bytes, "row", "most resident memory meanwhile, mapped files included"},
    {"disk_loaded", unit::bytes, "row", "disk space after the load"},
    {"disk_updated", unit::bytes, "row", "disk space after ten transactions that each updated every row"},
    {"disk_reopened", unit::bytes, "row", "the same, with the store closed and opened between the transactions"},
};

constexpr workload limits[] = {
    {"fsync_pair", unit::nanoseconds, "pair",
     "lseek, writev, fsync, lseek, write, fsync: the system calls of a transaction of one row, on a file that grows"},
    {"fsync_pair_kept", unit::nanoseconds, "pair", "the same inside a file that keeps its length"},
    {"memcpy", unit::gigabytes_a_second, "", "memory copied, 64 MiB at a time"},
    {"memory_access", unit::nanoseconds, "access", "a pointer followed to a random place in 256 MiB"},
    {"lock_pair", unit::nanoseconds, "pair", "an uncontended mutex locked and unlocked"},
    {"malloc_pair", unit::nanoseconds, "pair", "48 bytes allocated and freed"},
};

} // namespace

std::span<const workload> workloads()
{
    return all;
}

std::span<const workload> machine_limits()
{
    return limits;
}

} // namespace peers
