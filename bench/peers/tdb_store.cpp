// SPDX-License-Identifier: MIT
// tdb_store: tdb with its synced transactions.
//
// The file has as many hash chains as rows are expected, and the better of its two hash functions. Ids and names share
// the keys, told apart by their lengths, so that one transaction covers both. Records are read in the map, and copied
// out of it; a transaction of reads is a read lock on all chains. A file may be open once in a process, and by one
// thread: there is no second reader.
#include <fcntl.h>
#include <sys/types.h>

#include <vector>

#include <fmt/format.h>
#include <tdb.h>

#include "packed_row.h"
#include "store.h"

namespace peers
{

namespace
{

TDB_DATA data_of(std::string_view bytes)
{
    return {reinterpret_cast<unsigned char *>(const_cast<char *>(bytes.data())), bytes.size()};
}

TDB_DATA key_of(const std::uint64_t & id)
{
    return data_of({reinterpret_cast<const char *>(&id), sizeof id});
}

TDB_DATA key_of(const name_text & name)
{
    return data_of(name.view());
}

std::string_view view_of(TDB_DATA data)
{
    return {reinterpret_cast<const char *>(data.dptr), data.dsize};
}

std::uint64_t id_of(TDB_DATA data)
{
    std::uint64_t id;
    std::memcpy(&id, data.dptr, sizeof id);
    return id;
}

// Runs action, which may be any function object, on a record where it lies.
template <class Action> int parse(TDB_DATA, TDB_DATA data, void * p_action)
{
    (*static_cast<Action *>(p_action))(data);
    return 0;
}

template <class Action> int visit(tdb_context *, TDB_DATA key, TDB_DATA data, void * p_action)
{
    (*static_cast<Action *>(p_action))(key, data);
    return 0;
}

class tdb_store final : public store
{
  public:
    tdb_store(const place & where, access how) : found_by_(where.found_by)
    {
        const int flags = how == access::create ? O_RDWR | O_CREAT : O_RDWR; // one opened for reading takes no locks
        p_tdb_          = tdb_open((where.directory + "/rows.tdb").c_str(), static_cast<int>(where.rows | 1),
                                   TDB_INCOMPATIBLE_HASH, flags, 0644);
        require(p_tdb_ != nullptr, "tdb: open");
    }

    ~tdb_store() override { tdb_close(p_tdb_); }

    void insert(std::span<const row> rows) override
    {
        in_transaction([&] {
            for (const row & r : rows) {
                const packed_row packed(r, found_by_);
                put(found_by_ == layout::by_name ? key_of(r.name) : key_of(r.id), packed.view(), TDB_INSERT);
                if (found_by_ == layout::by_id_and_name)
                    put(key_of(r.name), view_of(key_of(r.id)), TDB_INSERT);
            }
        });
    }

    void update(std::span<const change> changes) override
    {
        in_transaction([&] {
            for (const change & c : changes) {
                packed_row packed{std::string_view()};
                get(key_of(c.id), [&](TDB_DATA data) { packed = packed_row(view_of(data)); });
                packed.set_count(c.count);
                put(key_of(c.id), packed.view(), TDB_MODIFY);
            }
        });
    }

    void erase(std::span<const std::uint64_t> ids) override
    {
        in_transaction([&] {
            for (const std::uint64_t id : ids)
                check(tdb_delete(p_tdb_, key_of(id)), "delete");
        });
    }

    // Not during the traversal: a record that is deleted then is only marked, and costs more than one deleted afterwards.
    void erase(filter wanted) override
    {
        std::vector<std::uint64_t> ids;
        with_predicate(wanted, [&](auto matches) {
            scan([&](std::uint64_t id, const stored_row & r) {
                if (matches(r.count(), r.name(), r.ratio()))
                    ids.push_back(id);
            });
        });
        erase(ids);
    }

    void erase_all() override
    {
        in_transaction([&] { check(tdb_wipe_all(p_tdb_), "wipe"); });
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
        return read_keys(ids, transactions, [&](std::uint64_t id) { return read_row(key_of(id), wanted); });
    }

    std::uint64_t read(std::span<const name_text> names, field wanted, scope transactions) override
    {
        if (found_by_ == layout::by_name)
            return read_keys(names, transactions,
                             [&](const name_text & name) { return read_row(key_of(name), wanted); });
        return read_keys(names, transactions, [&](const name_text & name) {
            std::uint64_t id = 0;
            get(key_of(name), [&](TDB_DATA data) { id = id_of(data); });
            return read_row(key_of(id), wanted);
        });
    }

    std::uint64_t read_all() override
    {
        std::uint64_t sum = 0;
        scan([&](std::uint64_t id, const stored_row & r) { sum += digest(r.unpacked(id)); });
        return sum;
    }

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
    // Changes every row; not during the traversal, for the reason above.
    template <class Change> void rewrite(Change change_row)
    {
        std::vector<std::pair<std::uint64_t, packed_row>> rows;
        scan([&](std::uint64_t id, const stored_row & r) {
            rows.emplace_back(id, packed_row(r.bytes()));
            change_row(rows.back().second);
        });
        in_transaction([&] {
            for (const auto & [id, packed] : rows)
                put(key_of(id), packed.view(), TDB_MODIFY);
        });
    }

    void check(int code, const char * p_what)
    {
        if (code < 0)
            throw std::runtime_error(fmt::format("tdb: {}: {}", p_what, tdb_errorstr(p_tdb_)));
    }

    template <class Action> void in_transaction(Action action)
    {
        check(tdb_transaction_start(p_tdb_), "begin");
        action();
        check(tdb_transaction_commit(p_tdb_), "commit");
    }

    void put(TDB_DATA key, std::string_view value, int how)
    {
        check(::tdb_store(p_tdb_, key, data_of(value), how), "store");
    }

    template <class Action> void get(TDB_DATA key, Action action)
    {
        check(tdb_parse_record(p_tdb_, key, parse<Action>, &action), "get");
    }

    std::uint64_t read_row(TDB_DATA key, field wanted)
    {
        std::uint64_t sum = 0;
        get(key, [&](TDB_DATA data) { sum = stored_row(view_of(data)).digest_of(wanted); });
        return sum;
    }

    template <class Keys, class Read> std::uint64_t read_keys(Keys keys, scope transactions, Read read_key)
    {
        if (transactions == scope::together)
            check(tdb_lockall_read(p_tdb_), "lock");
        std::uint64_t sum = 0;
        for (const auto & key : keys)
            sum += read_key(key);
        if (transactions == scope::together)
            tdb_unlockall_read(p_tdb_);
        return sum;
    }

    // Visits all rows, which lie under their ids.
    template <class Visit> void scan(Visit action)
    {
        auto on_record = [&](TDB_DATA key, TDB_DATA data) { action(id_of(key), stored_row(view_of(data))); };
        check(tdb_lockall_read(p_tdb_), "lock"); // once instead of chain by chain
        check(tdb_traverse_read(p_tdb_, visit<decltype(on_record)>, &on_record), "traverse");
        tdb_unlockall_read(p_tdb_);
    }

    layout        found_by_;
    tdb_context * p_tdb_ = nullptr;
    copied_rows   copy_;
};

} // namespace

std::unique_ptr<store> open_tdb(const place & where, access how)
{
    return std::make_unique<tdb_store>(where, how);
}

} // namespace peers
