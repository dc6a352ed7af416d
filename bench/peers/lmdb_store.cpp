// SPDX-License-Identifier: MIT
// lmdb_store: LMDB with its default, synced transactions.
//
// Rows lie under native integer keys; a second database leads from the name to the id. Bulk loads append, since their
// keys ascend. A value is read in the map, and copied out of it. The reading transaction is reset and renewed rather
// than made again, and updates go through a cursor, which finds the row once.
#include <cstddef>
#include <utility>

#include <fmt/format.h>
#include <lmdb.h>

#include "packed_row.h"
#include "store.h"

namespace peers
{

namespace
{

void check(int code, const char * p_what)
{
    if (code != MDB_SUCCESS)
        throw std::runtime_error(fmt::format("lmdb: {}: {}", p_what, mdb_strerror(code)));
}

MDB_val value_of(const void * p_data, std::size_t length)
{
    return {length, const_cast<void *>(p_data)};
}

MDB_val key_of(const std::uint64_t & id)
{
    return value_of(&id, sizeof id);
}

MDB_val key_of(const name_text & name)
{
    return value_of(name.text, name_length);
}

std::string_view view_of(const MDB_val & value)
{
    return {static_cast<const char *>(value.mv_data), value.mv_size};
}

std::uint64_t id_of(const MDB_val & key)
{
    std::uint64_t id;
    std::memcpy(&id, key.mv_data, sizeof id);
    return id;
}

// A writing transaction, aborted unless it was committed.
class transaction
{
  public:
    explicit transaction(MDB_env * p_env) { check(mdb_txn_begin(p_env, nullptr, 0, &p_txn_), "begin"); }
    ~transaction()
    {
        if (p_txn_ != nullptr)
            mdb_txn_abort(p_txn_);
    }
    transaction(const transaction &)             = delete;
    transaction & operator=(const transaction &) = delete;

         operator MDB_txn *() const { return p_txn_; }
    void commit() { check(mdb_txn_commit(std::exchange(p_txn_, nullptr)), "commit"); }

  private:
    MDB_txn * p_txn_ = nullptr;
};

class cursor
{
  public:
    cursor(MDB_txn * p_txn, MDB_dbi database) { check(mdb_cursor_open(p_txn, database, &p_cursor_), "cursor"); }
    ~cursor() { mdb_cursor_close(p_cursor_); }
    cursor(const cursor &)             = delete;
    cursor & operator=(const cursor &) = delete;

    operator MDB_cursor *() const { return p_cursor_; }

  private:
    MDB_cursor * p_cursor_ = nullptr;
};

struct environment {
    environment(const place & where, access how)
    {
        check(mdb_env_create(&p_env), "create");
        mdb_env_set_maxdbs(p_env, 2);
        mdb_env_set_mapsize(p_env, std::size_t{64} << 30); // address space only
        check(mdb_env_open(p_env, where.directory.c_str(), MDB_NOTLS, 0644), "open");
        transaction    t(p_env);
        const unsigned make = how == access::create ? MDB_CREATE : 0;
        check(mdb_dbi_open(t, "rows", where.found_by == layout::by_name ? make : make | MDB_INTEGERKEY, &rows), "rows");
        if (where.found_by == layout::by_id_and_name)
            check(mdb_dbi_open(t, "names", make, &names), "names");
        t.commit();
    }
    ~environment() { mdb_env_close(p_env); }
    environment(const environment &)             = delete;
    environment & operator=(const environment &) = delete;

    MDB_env * p_env = nullptr;
    MDB_dbi   rows  = 0;
    MDB_dbi   names = 0;
};

class lmdb_store final : public store
{
  public:
    lmdb_store(std::shared_ptr<environment> p_environment, layout found_by)
        : p_environment_(std::move(p_environment)), e_(*p_environment_), found_by_(found_by)
    {
        check(mdb_txn_begin(e_.p_env, nullptr, MDB_RDONLY, &p_reading_), "begin reading");
        mdb_txn_reset(p_reading_);
    }

    ~lmdb_store() override { mdb_txn_abort(p_reading_); }

    void insert(std::span<const row> rows) override
    {
        transaction    t(e_.p_env);
        const unsigned flags = found_by_ == layout::by_name ? MDB_NOOVERWRITE : MDB_APPEND;
        const cursor   at(t, e_.rows);
        for (const row & r : rows) {
            const packed_row packed(r, found_by_);
            MDB_val          key   = found_by_ == layout::by_name ? key_of(r.name) : key_of(r.id);
            MDB_val          value = value_of(packed.view().data(), packed.view().size());
            check(mdb_cursor_put(at, &key, &value, flags), "put");
        }
        if (found_by_ == layout::by_id_and_name)
            insert_names(t, rows);
        t.commit();
    }

    void update(std::span<const change> changes) override
    {
        transaction t(e_.p_env);
        {
            const cursor at(t, e_.rows);
            for (const change & c : changes) {
                MDB_val key = key_of(c.id);
                MDB_val value;
                check(mdb_cursor_get(at, &key, &value, MDB_SET_KEY), "find");
                packed_row packed(view_of(value));
                packed.set_count(c.count);
                value = value_of(packed.view().data(), packed.view().size());
                check(mdb_cursor_put(at, &key, &value, MDB_CURRENT), "put");
            }
        }
        t.commit();
    }

    void erase(std::span<const std::uint64_t> ids) override
    {
        transaction t(e_.p_env);
        for (const std::uint64_t id : ids) {
            MDB_val key = key_of(id);
            check(mdb_del(t, e_.rows, &key, nullptr), "delete");
        }
        t.commit();
    }

    void erase(filter wanted) override
    {
        transaction t(e_.p_env);
        {
            const cursor at(t, e_.rows);
            with_predicate(wanted, [&](auto matches) {
                MDB_val key;
                MDB_val value;
                while (mdb_cursor_get(at, &key, &value, MDB_NEXT) == MDB_SUCCESS) {
                    const stored_row r(view_of(value));
                    if (matches(r.count(), r.name(), r.ratio()))
                        check(mdb_cursor_del(at, 0), "delete");
                }
            });
        }
        t.commit();
    }

    void erase_all() override
    {
        transaction t(e_.p_env);
        check(mdb_drop(t, e_.rows, 0), "drop");
        t.commit();
    }

    void add_column() override
    {
        rewrite([](packed_row & r) { r.append(added_default); });
    }

    void drop_column() override
    {
        rewrite([](packed_row & r) { r.cut(); });
    }

    std::uint64_t sum_added() override
    {
        std::uint64_t sum = 0;
        scan([&](std::uint64_t, const stored_row & r) { sum += digest(r.added()); });
        return sum;
    }

    std::uint64_t read(std::span<const std::uint64_t> ids, field wanted, scope transactions) override
    {
        return read_keys(ids, transactions, [&](std::uint64_t id) { return get(key_of(id)).digest_of(wanted); });
    }

    std::uint64_t read(std::span<const name_text> names, field wanted, scope transactions) override
    {
        if (found_by_ == layout::by_name)
            return read_keys(names, transactions,
                             [&](const name_text & name) { return get(key_of(name)).digest_of(wanted); });
        return read_keys(names, transactions, [&](const name_text & name) {
            MDB_val key = key_of(name);
            MDB_val id;
            check(mdb_get(p_reading_, e_.names, &key, &id), "get id");
            return get(id).digest_of(wanted);
        });
    }

    std::uint64_t read_all() override
    {
        std::uint64_t sum = 0;
        scan([&](std::uint64_t id, const stored_row & r) { sum += digest(r.unpacked(id)); });
        return sum;
    }

    std::unique_ptr<store> share() override { return std::make_unique<lmdb_store>(p_environment_, found_by_); }

    std::size_t count(filter wanted) override
    {
        return with_predicate(wanted, [&](auto matches) {
            std::size_t total = 0;
            scan([&](std::uint64_t, const stored_row & r) { total += matches(r.count(), r.name(), r.ratio()); });
            return total;
        });
    }

    std::size_t copy(filter wanted) override
    {
        return with_predicate(wanted, [&](auto matches) {
            scan([&](std::uint64_t id, const stored_row & r) {
                if (matches(r.count(), r.name(), r.ratio()))
                    copy_.add(r.unpacked(id));
            });
            return copy_.size();
        });
    }

    std::uint64_t drop_copy() override { return copy_.drop(); }

  private:
    // Changes every row.
    template <class Change> void rewrite(Change change_row)
    {
        transaction t(e_.p_env);
        {
            const cursor at(t, e_.rows);
            MDB_val      key;
            MDB_val      value;
            while (mdb_cursor_get(at, &key, &value, MDB_NEXT) == MDB_SUCCESS) {
                const std::uint64_t id = id_of(key); // a copy: what the cursor delivers lies in the page that changes
                packed_row          packed(view_of(value));
                change_row(packed);
                key   = key_of(id);
                value = value_of(packed.view().data(), packed.view().size());
                check(mdb_cursor_put(at, &key, &value, MDB_CURRENT), "rewrite");
            }
        }
        t.commit();
    }

    void insert_names(MDB_txn * p_txn, std::span<const row> rows)
    {
        for (const row & r : rows) {
            MDB_val key = key_of(r.name);
            MDB_val id  = key_of(r.id);
            check(mdb_put(p_txn, e_.names, &key, &id, MDB_NOOVERWRITE), "put name");
        }
    }

    stored_row get(MDB_val key)
    {
        MDB_val value;
        check(mdb_get(p_reading_, e_.rows, &key, &value), "get");
        return stored_row(view_of(value));
    }

    template <class Action> void reading(Action action)
    {
        check(mdb_txn_renew(p_reading_), "renew");
        action();
        mdb_txn_reset(p_reading_);
    }

    template <class Keys, class Read> std::uint64_t read_keys(Keys keys, scope transactions, Read read_key)
    {
        std::uint64_t sum = 0;
        if (transactions == scope::alone) {
            for (const auto & key : keys)
                reading([&] { sum += read_key(key); });
            return sum;
        }
        reading([&] {
            for (const auto & key : keys)
                sum += read_key(key);
        });
        return sum;
    }

    // Visits all rows, which lie under their ids.
    template <class Visit> void scan(Visit visit)
    {
        reading([&] {
            const cursor at(p_reading_, e_.rows);
            MDB_val      key;
            MDB_val      value;
            while (mdb_cursor_get(at, &key, &value, MDB_NEXT) == MDB_SUCCESS) {
                visit(id_of(key), stored_row(view_of(value)));
            }
        });
    }

    std::shared_ptr<environment> p_environment_; // shared by the stores of all threads: a process opens it once
    environment &                e_;
    layout                       found_by_;
    MDB_txn *                    p_reading_ = nullptr;
    copied_rows                  copy_;
};

} // namespace

std::unique_ptr<store> open_lmdb(const place & where, access how)
{
    return std::make_unique<lmdb_store>(std::make_shared<environment>(where, how), where.found_by);
}

} // namespace peers
