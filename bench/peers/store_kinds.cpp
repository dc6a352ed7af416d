// SPDX-License-Identifier: MIT
#include "store.h"

namespace peers
{

namespace
{

constexpr store_kind kinds[] = {
    {"kt_rg", "this library, with a hash function of the caller's", open_kt_rg},
    {"kt_rg-plain", "this library, without a hash function", open_kt_rg_plain},
#ifdef PEERS_WITH_SQLITE
    {"sqlite-wal", "SQLite, write-ahead log, synchronous FULL", open_sqlite_wal},
    {"sqlite-rollback", "SQLite, rollback journal, synchronous FULL", open_sqlite_rollback},
    {"sqlite-exclusive", "SQLite, write-ahead log, exclusive locking, memory-mapped", open_sqlite_exclusive},
#endif
#ifdef PEERS_WITH_LMDB
    {"lmdb", "LMDB", open_lmdb},
#endif
#ifdef PEERS_WITH_LEVELDB
    {"leveldb", "LevelDB, synced writes", open_leveldb},
#endif
#ifdef PEERS_WITH_TDB
    {"tdb", "tdb, transactions", open_tdb},
#endif
};

} // namespace

std::span<const store_kind> store_kinds()
{
    return kinds;
}

} // namespace peers
