// SPDX-License-Identifier: MIT
// sqlite_store: SQLite, in three configurations.
//
// Statements are prepared once. The page cache is large enough for every table, since this library has its tables in
// memory too; the memory statistics, which cost a mutex each time, are off. A connection is used by one thread only,
// and says so. The journal is truncated rather than deleted, which is as fast as keeping it and disturbs readers less.
// A row that is read alone is read in the transaction that a statement makes by itself.
#include <map>
#include <mutex>

#include <fmt/format.h>
#include <sqlite3.h>

#include "store.h"

namespace peers
{

namespace
{

struct configuration {
    const char * p_journal;
    bool         exclusive; // with memory-mapped reading
};

void configure_library()
{
    static std::once_flag once;
    std::call_once(once, [] { sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0); });
}

// The text of a result column; it lies in the database.
std::string_view text_of(sqlite3_stmt * p_statement, int column)
{
    const auto * p_text = reinterpret_cast<const char *>(sqlite3_column_text(p_statement, column));
    return {p_text, static_cast<std::size_t>(sqlite3_column_bytes(p_statement, column))};
}

row row_of_result(sqlite3_stmt * p_statement)
{
    row r;
    r.id    = static_cast<std::uint64_t>(sqlite3_column_int64(p_statement, 0));
    r.count = sqlite3_column_int64(p_statement, 1);
    r.ratio = sqlite3_column_double(p_statement, 2);
    std::memcpy(r.name.text, text_of(p_statement, 3).data(), sizeof r.name.text);
    std::memcpy(r.note, text_of(p_statement, 4).data(), sizeof r.note);
    return r;
}

class sqlite_store final : public store
{
  public:
    sqlite_store(const place & where, access how, configuration c) : where_(where), configuration_(c)
    {
        configure_library();
        const int how_flags =
            how == access::create ? SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE : SQLITE_OPEN_READWRITE;
        check(sqlite3_open_v2((where.directory + "/rows.db").c_str(), &p_db_, how_flags | SQLITE_OPEN_NOMUTEX, nullptr),
              "open");
        configure_reading();
        if (how != access::read)
            configure_writing();
        if (how == access::create)
            create_table();
    }

    ~sqlite_store() override
    {
        for (const auto & [sql, p_statement] : statements_)
            sqlite3_finalize(p_statement);
        sqlite3_close(p_db_);
    }

    void insert(std::span<const row> rows) override
    {
        sqlite3_stmt * p = prepared("insert into t(id, count, ratio, name, note) values(?, ?, ?, ?, ?)");
        in_transaction(rows.size() > 1, [&] {
            for (const row & r : rows) {
                sqlite3_bind_int64(p, 1, static_cast<sqlite3_int64>(r.id));
                sqlite3_bind_int64(p, 2, r.count);
                sqlite3_bind_double(p, 3, r.ratio);
                sqlite3_bind_text(p, 4, r.name.text, name_length, SQLITE_STATIC);
                sqlite3_bind_text(p, 5, r.note, note_length, SQLITE_STATIC);
                finish(p, "insert");
            }
        });
    }

    void update(std::span<const change> changes) override
    {
        sqlite3_stmt * p = prepared("update t set count = ? where id = ?");
        in_transaction(changes.size() > 1, [&] {
            for (const change & c : changes) {
                sqlite3_bind_int64(p, 1, c.count);
                sqlite3_bind_int64(p, 2, static_cast<sqlite3_int64>(c.id));
                finish(p, "update");
            }
        });
    }

    void erase(std::span<const std::uint64_t> ids) override
    {
        sqlite3_stmt * p = prepared("delete from t where id = ?");
        in_transaction(true, [&] {
            for (const std::uint64_t id : ids) {
                sqlite3_bind_int64(p, 1, static_cast<sqlite3_int64>(id));
                finish(p, "delete");
            }
        });
    }

    void erase(filter wanted) override { run(fmt::format("delete from t where {}", sql_of(wanted))); }

    void erase_all() override { run("delete from t"); }

    // Only the schema changes: rows that lack a column have its default.
    void add_column() override { run(fmt::format("alter table t add column added integer default {}", added_default)); }

    void drop_column() override { run("alter table t drop column added"); }

    std::uint64_t sum_added() override
    {
        sqlite3_stmt * p = nullptr; // not kept: it would have to be prepared anew without the column
        check(sqlite3_prepare_v2(p_db_, "select sum(added) from t", -1, &p, nullptr), "sum");
        sqlite3_step(p);
        const auto sum = static_cast<std::uint64_t>(sqlite3_column_int64(p, 0));
        check(sqlite3_finalize(p), "sum");
        return sum;
    }

    std::uint64_t read(std::span<const std::uint64_t> ids, field wanted, scope transactions) override
    {
        sqlite3_stmt * p = prepared(fmt::format("select {} from t where id = ?", column_of(wanted)));
        return read_keys(p, ids, wanted, transactions,
                         [p](std::uint64_t id) { sqlite3_bind_int64(p, 1, static_cast<sqlite3_int64>(id)); });
    }

    std::uint64_t read(std::span<const name_text> names, field wanted, scope transactions) override
    {
        sqlite3_stmt * p = prepared(fmt::format("select {} from t where name = ?", column_of(wanted)));
        return read_keys(p, names, wanted, transactions, [p](const name_text & name) {
            sqlite3_bind_text(p, 1, name.text, name_length, SQLITE_STATIC);
        });
    }

    std::uint64_t read_all() override
    {
        sqlite3_stmt * p   = prepared("select id, count, ratio, name, note from t");
        std::uint64_t  sum = 0;
        while (sqlite3_step(p) == SQLITE_ROW)
            sum += digest(row_of_result(p));
        check(sqlite3_reset(p), "read all");
        return sum;
    }

    // Another connection; where the first one locks all others out there is none.
    std::unique_ptr<store> share() override
    {
        if (configuration_.exclusive)
            return nullptr;
        return std::make_unique<sqlite_store>(where_, access::read, configuration_);
    }

    std::size_t count(filter wanted) override
    {
        sqlite3_stmt * p = prepared(fmt::format("select count(*) from t where {}", sql_of(wanted)));
        require(sqlite3_step(p) == SQLITE_ROW, "sqlite: count");
        const auto total = static_cast<std::size_t>(sqlite3_column_int64(p, 0));
        check(sqlite3_reset(p), "count");
        return total;
    }

    std::size_t copy(filter wanted) override
    {
        sqlite3_stmt * p = prepared(fmt::format("select id, count, ratio, name, note from t where {}", sql_of(wanted)));
        while (sqlite3_step(p) == SQLITE_ROW)
            copy_.add(row_of_result(p));
        check(sqlite3_reset(p), "copy");
        return copy_.size();
    }

    std::uint64_t drop_copy() override { return copy_.drop(); }

  private:
    void check(int code, const char * p_what)
    {
        if (code != SQLITE_OK)
            throw std::runtime_error(fmt::format("sqlite: {}: {}", p_what, sqlite3_errmsg(p_db_)));
    }

    void run(const std::string & sql)
    {
        check(sqlite3_exec(p_db_, sql.c_str(), nullptr, nullptr, nullptr), sql.c_str());
    }

    void configure_reading()
    {
        if (configuration_.exclusive) { // ahead of the journal mode, so that the log's index isn't shared
            run("pragma locking_mode = exclusive");
            run("pragma mmap_size = 2147483648");
        }
        run("pragma cache_size = -524288");
        run("pragma case_sensitive_like = on"); // as this library's "like"
    }

    void configure_writing()
    {
        run(fmt::format("pragma journal_mode = {}", configuration_.p_journal));
        run("pragma synchronous = full");
        run("pragma journal_size_limit = 1048576"); // what is left beside the table afterwards
    }

    void create_table()
    {
        if (where_.found_by == layout::by_name) {
            run("create table t(name text primary key, id integer, count integer, ratio real, note text) without "
                "rowid");
            return;
        }
        run("create table t(id integer primary key, count integer, ratio real, name text, note text)");
        if (where_.found_by == layout::by_id_and_name)
            run("create unique index t_name on t(name)");
    }

    sqlite3_stmt * prepared(const std::string & sql)
    {
        sqlite3_stmt *& p_statement = statements_[sql];
        if (p_statement == nullptr)
            check(sqlite3_prepare_v3(p_db_, sql.c_str(), -1, SQLITE_PREPARE_PERSISTENT, &p_statement, nullptr),
                  sql.c_str());
        return p_statement;
    }

    void finish(sqlite3_stmt * p_statement, const char * p_what)
    {
        sqlite3_step(p_statement);
        check(sqlite3_reset(p_statement), p_what);
    }

    template <class Action> void in_transaction(bool more_than_one, Action action)
    {
        if (!more_than_one)
            return action();
        finish(prepared("begin"), "begin");
        action();
        finish(prepared("commit"), "commit");
    }

    static const char * column_of(field wanted) { return wanted == field::count ? "count" : "note"; }

    template <class Keys, class Bind>
    std::uint64_t read_keys(sqlite3_stmt * p, Keys keys, field wanted, scope transactions, Bind bind)
    {
        std::uint64_t sum = 0;
        in_transaction(transactions == scope::together, [&] {
            for (const auto & key : keys) {
                bind(key);
                require(sqlite3_step(p) == SQLITE_ROW, "sqlite: no such row");
                if (wanted == field::count) {
                    sum += digest(std::int64_t{sqlite3_column_int64(p, 0)});
                } else {
                    char note[note_length + 1];
                    std::memcpy(note, text_of(p, 0).data(), sizeof note);
                    sum += digest(std::string_view(note, note_length));
                }
                sqlite3_reset(p);
            }
        });
        return sum;
    }

    place                                 where_;
    configuration                         configuration_;
    sqlite3 *                             p_db_ = nullptr;
    std::map<std::string, sqlite3_stmt *> statements_;
    copied_rows                           copy_;
};

std::unique_ptr<store> open_with(const place & where, access how, configuration c)
{
    return std::make_unique<sqlite_store>(where, how, c);
}

} // namespace

std::unique_ptr<store> open_sqlite_wal(const place & where, access how)
{
    return open_with(where, how, {"wal", false});
}

std::unique_ptr<store> open_sqlite_rollback(const place & where, access how)
{
    return open_with(where, how, {"truncate", false});
}

std::unique_ptr<store> open_sqlite_exclusive(const place & where, access how)
{
    return open_with(where, how, {"wal", true});
}

} // namespace peers
