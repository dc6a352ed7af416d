// SPDX-License-Identifier: MIT
// store: what is asked of every store. A .cpp file beside this one answers for each.
//
// A store lies in a directory of its own. What changes it is one transaction, durable when the call returns. What it
// delivers is copied out of it: the caller could keep it whatever becomes of the store. Calls work through many keys at
// once, so that a virtual call costs nothing beside them. What a store can't do it doesn't answer: the workload is left
// out for it. What goes wrong throws.
#ifndef PEERS_STORE_H
#define PEERS_STORE_H

#include <cstdint>
#include <memory>
#include <span>
#include <string>

#include "common/require.h"
#include "common/rows.h"

namespace peers
{

using namespace bench;

// What rows are found by: the key that they lie under, and whether there is a second way to them.
enum class layout { by_id, by_name, by_id_and_name };

// Whether each read is a transaction of its own, or all of one call share one.
enum class scope { alone, together };

enum class access { create, write, read };

// The value of the column that is added.
constexpr std::int64_t added_default = 7;

struct place {
    std::string directory;
    layout      found_by;
    std::size_t rows; // how many are expected: for what has to be sized ahead
};

class store
{
  public:
    store()                          = default;
    store(const store &)             = delete;
    store & operator=(const store &) = delete;
    virtual ~store()                 = default; // closes it

    // ---- One durable transaction each ----

    // Rows whose ids ascend, beyond all that are there.
    virtual void insert(std::span<const row> rows)         = 0;
    virtual void update(std::span<const change> changes)   = 0;
    virtual void erase(std::span<const std::uint64_t> ids) = 0;
    virtual void erase(filter wanted)                      = 0;
    virtual void erase_all()                               = 0;

    // ---- Columns: an integer one is added to the others, with a default value, and dropped; one transaction each ----

    virtual void add_column()  = 0;
    virtual void drop_column() = 0;
    // The sum of that column over all rows.
    virtual std::uint64_t sum_added() = 0;

    // ---- Reading; each delivers the sum of what it read ----

    virtual std::uint64_t read(std::span<const std::uint64_t> ids, field wanted, scope transactions) = 0;
    virtual std::uint64_t read(std::span<const name_text> names, field wanted, scope transactions)   = 0;
    virtual std::uint64_t read_all()                                                                 = 0;

    // A second way to the same store, for another thread; it must go first. None if only one thread may read.
    virtual std::unique_ptr<store> share() { return nullptr; }

    // ---- Scanning; each delivers how many rows match ----

    virtual std::size_t count(filter wanted) = 0;
    // Copies all fields of the rows into memory, where they stay until drop_copy, which delivers their digest.
    virtual std::size_t   copy(filter wanted) = 0;
    virtual std::uint64_t drop_copy()         = 0;
};

struct store_kind {
    const char * name;
    const char * description;
    std::unique_ptr<store> (*open)(const place & where, access how);
};

// This library first, in the order in which they are reported.
std::span<const store_kind> store_kinds();

// A configuration of each, in the order of store_kinds.
std::unique_ptr<store> open_kt_rg(const place & where, access how);
std::unique_ptr<store> open_kt_rg_plain(const place & where, access how);
std::unique_ptr<store> open_sqlite_wal(const place & where, access how);
std::unique_ptr<store> open_sqlite_rollback(const place & where, access how);
std::unique_ptr<store> open_sqlite_exclusive(const place & where, access how);
std::unique_ptr<store> open_lmdb(const place & where, access how);
std::unique_ptr<store> open_leveldb(const place & where, access how);
std::unique_ptr<store> open_tdb(const place & where, access how);

} // namespace peers

#endif
