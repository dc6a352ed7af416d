// SPDX-License-Identifier: MIT
// leveldb_store: LevelDB with synced writes.
//
// It has a block cache that holds every table, a Bloom filter of 10 bits a key, and a write buffer of 64 MiB; blocks are
// compressed, as by default. There are no tables: ids and names share the keys, told apart by their lengths. Ids are
// big-endian, so that rows stand in their order. A transaction is one batch; one of reads is a snapshot.
#include <endian.h>
#include <leveldb/cache.h>
#include <leveldb/db.h>
#include <leveldb/filter_policy.h>
#include <leveldb/write_batch.h>

#include <fmt/format.h>

#include "packed_row.h"
#include "store.h"

namespace peers
{

namespace
{

void check(const leveldb::Status & status, const char * p_what)
{
    if (!status.ok())
        throw std::runtime_error(fmt::format("leveldb: {}: {}", p_what, status.ToString()));
}

leveldb::Slice slice_of(std::string_view bytes)
{
    return {bytes.data(), bytes.size()};
}

std::string_view view_of(const leveldb::Slice & slice)
{
    return {slice.data(), slice.size()};
}

class id_key
{
  public:
    explicit id_key(std::uint64_t id) : bytes_(htobe64(id)) {}

    operator leveldb::Slice() const { return {reinterpret_cast<const char *>(&bytes_), sizeof bytes_}; }

  private:
    std::uint64_t bytes_;
};

std::uint64_t id_of(std::string_view key)
{
    std::uint64_t bytes;
    std::memcpy(&bytes, key.data(), sizeof bytes);
    return be64toh(bytes);
}

struct database {
    database(const place & where, access how)
        : p_cache(leveldb::NewLRUCache(std::size_t{512} << 20)), p_filter(leveldb::NewBloomFilterPolicy(10))
    {
        leveldb::Options options;
        options.create_if_missing = how == access::create;
        options.block_cache       = p_cache.get();
        options.filter_policy     = p_filter.get();
        options.write_buffer_size = std::size_t{64} << 20;
        leveldb::DB * p_opened    = nullptr;
        check(leveldb::DB::Open(options, where.directory, &p_opened), "open");
        p_db.reset(p_opened);
    }

    std::unique_ptr<leveldb::Cache>              p_cache;
    std::unique_ptr<const leveldb::FilterPolicy> p_filter;
    std::unique_ptr<leveldb::DB>                 p_db;
};

class leveldb_store final : public store
{
  public:
    leveldb_store(std::shared_ptr<database> p_database, layout found_by)
        : p_database_(std::move(p_database)), db_(*p_database_->p_db), found_by_(found_by)
    {
    }

    void insert(std::span<const row> rows) override
    {
        leveldb::WriteBatch batch;
        for (const row & r : rows) {
            const packed_row packed(r, found_by_);
            if (found_by_ == layout::by_name)
                batch.Put(slice_of(r.name.view()), slice_of(packed.view()));
            else
                batch.Put(id_key(r.id), slice_of(packed.view()));
            if (found_by_ == layout::by_id_and_name)
                batch.Put(slice_of(r.name.view()), id_key(r.id));
        }
        write(batch);
    }

    void update(std::span<const change> changes) override
    {
        leveldb::WriteBatch batch;
        for (const change & c : changes) {
            const id_key key(c.id);
            check(db_.Get({}, key, &value_), "get");
            packed_row packed{std::string_view(value_)};
            packed.set_count(c.count);
            batch.Put(key, slice_of(packed.view()));
        }
        write(batch);
    }

    void erase(std::span<const std::uint64_t> ids) override
    {
        leveldb::WriteBatch batch;
        for (const std::uint64_t id : ids)
            batch.Delete(id_key(id));
        write(batch);
    }

    void erase(filter wanted) override
    {
        leveldb::WriteBatch batch;
        with_predicate(wanted, [&](auto matches) {
            scan([&](std::string_view key, const stored_row & r) {
                if (matches(r.count(), r.name(), r.ratio()))
                    batch.Delete(slice_of(key));
            });
        });
        write(batch);
    }

    void erase_all() override { erase(filter::everything); }

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
        scan([&](std::string_view, const stored_row & r) { sum += digest(r.added()); });
        return sum;
    }

    std::uint64_t read(std::span<const std::uint64_t> ids, field wanted, scope transactions) override
    {
        return read_keys(ids, transactions, [&](const leveldb::ReadOptions & how, std::uint64_t id) {
            return get(how, id_key(id)).digest_of(wanted);
        });
    }

    std::uint64_t read(std::span<const name_text> names, field wanted, scope transactions) override
    {
        if (found_by_ == layout::by_name)
            return read_keys(names, transactions, [&](const leveldb::ReadOptions & how, const name_text & name) {
                return get(how, slice_of(name.view())).digest_of(wanted);
            });
        return read_keys(names, transactions, [&](const leveldb::ReadOptions & how, const name_text & name) {
            check(db_.Get(how, slice_of(name.view()), &value_), "get id");
            return get(how, id_key(id_of(value_))).digest_of(wanted);
        });
    }

    std::uint64_t read_all() override
    {
        std::uint64_t sum = 0;
        scan([&](std::string_view key, const stored_row & r) { sum += digest(r.unpacked(id_of(key))); });
        return sum;
    }

    std::unique_ptr<store> share() override { return std::make_unique<leveldb_store>(p_database_, found_by_); }

    std::size_t count(filter wanted) override
    {
        return with_predicate(wanted, [&](auto matches) {
            std::size_t total = 0;
            scan([&](std::string_view, const stored_row & r) { total += matches(r.count(), r.name(), r.ratio()); });
            return total;
        });
    }

    std::size_t copy(filter wanted) override
    {
        return with_predicate(wanted, [&](auto matches) {
            scan([&](std::string_view key, const stored_row & r) {
                if (matches(r.count(), r.name(), r.ratio()))
                    copy_.add(r.unpacked(id_of(key)));
            });
            return copy_.size();
        });
    }

    std::uint64_t drop_copy() override { return copy_.drop(); }

  private:
    // Changes every row.
    template <class Change> void rewrite(Change change_row)
    {
        leveldb::WriteBatch batch;
        scan([&](std::string_view key, const stored_row & r) {
            packed_row packed(r.bytes());
            change_row(packed);
            batch.Put(slice_of(key), slice_of(packed.view()));
        });
        write(batch);
    }

    void write(leveldb::WriteBatch & batch)
    {
        leveldb::WriteOptions durable;
        durable.sync = true;
        check(db_.Write(durable, &batch), "write");
    }

    stored_row get(const leveldb::ReadOptions & how, const leveldb::Slice & key)
    {
        check(db_.Get(how, key, &value_), "get");
        return stored_row(value_);
    }

    template <class Keys, class Read> std::uint64_t read_keys(Keys keys, scope transactions, Read read_key)
    {
        leveldb::ReadOptions how;
        if (transactions == scope::together)
            how.snapshot = db_.GetSnapshot();
        std::uint64_t sum = 0;
        for (const auto & key : keys)
            sum += read_key(how, key);
        if (how.snapshot != nullptr)
            db_.ReleaseSnapshot(how.snapshot);
        return sum;
    }

    // Visits all rows, which lie under their ids.
    template <class Visit> void scan(Visit visit)
    {
        const std::unique_ptr<leveldb::Iterator> p_at(db_.NewIterator({}));
        for (p_at->SeekToFirst(); p_at->Valid(); p_at->Next())
            visit(view_of(p_at->key()), stored_row(view_of(p_at->value())));
        check(p_at->status(), "scan");
    }

    std::shared_ptr<database> p_database_; // shared by the stores of all threads: a process opens it once
    leveldb::DB &             db_;
    layout                    found_by_;
    std::string               value_; // kept, so that it has its room already
    copied_rows               copy_;
};

} // namespace

std::unique_ptr<store> open_leveldb(const place & where, access how)
{
    return std::make_unique<leveldb_store>(std::make_shared<database>(where, how), where.found_by);
}

} // namespace peers
