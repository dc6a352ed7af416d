// SPDX-License-Identifier: MIT
// kt_rg_store: this library, through its public interface.
//
// A table is keyed by the id or by the name. For the second way to a row there is a second table from name to id, as in
// the key-value stores; unlike theirs its transaction is one of its own. A read is a call that locks and unlocks the
// table: there are no reading transactions, so reading alone and together are the same.
#include <cstdarg>
#include <cstdlib>

#include <fmt/format.h>

#include "common/kt_rg_rows.h"
#include "store.h"

namespace peers
{

namespace
{

char Mount_Point[]{"/m"}, Rows_Path[]{"/m/rows"}, Names_Path[]{"/m/names"};

class kt_rg_store final : public store
{
  public:
    kt_rg_store(const place & where, access how, bool hashed) : where_(where), hashed_(hashed), owner_(true)
    {
        check(rg_open_tree_1(&tree_, 0, 0), "open tree");
        check(rg_mount_local_tree_1(tree_, Mount_Point, where_.directory.data(), 1), "mount");
        const bool  by_name = where.found_by == layout::by_name;
        rg_column_t definitions[columns]{column(Id, KT_UINT64, !by_name), column(Count, KT_INT64, false),
                                         column(Ratio, KT_FLOAT64, false), column(Name, KT_CHAR_PTR, by_name),
                                         column(Note, KT_CHAR_PTR, false)};
        rows_ = open(Rows_Path, definitions, by_name, how);
        if (where.found_by == layout::by_id_and_name) {
            rg_column_t names[]{column(Name, KT_CHAR_PTR, true), column(Id, KT_UINT64, false)};
            names_ = open(Names_Path, names, true, how);
        }
    }

    // A second user of the same handles.
    explicit kt_rg_store(const kt_rg_store * p_owner)
        : where_(p_owner->where_), hashed_(p_owner->hashed_), owner_(false), tree_(p_owner->tree_),
          rows_(p_owner->rows_), names_(p_owner->names_)
    {
    }

    ~kt_rg_store() override
    {
        if (owner_)
            rg_close_tree_1(tree_);
    }

    void insert(std::span<const row> rows) override
    {
        row_values values;
        for (const row & r : rows) {
            values.become(r);
            check(rg_add_row_1(rows_, values.names, values.pointers, columns), "add");
        }
        commit(rows_);
        if (names_ != nullptr)
            insert_names(rows);
    }

    void update(std::span<const change> changes) override
    {
        kt_value_t count;
        for (const change & c : changes) {
            count.val_int64 = c.count;
            check(rg_set_field_by_key_1(rows_, value_of(c.id), Count, &count), "set");
        }
        commit(rows_);
    }

    // There is no deleting by key: the keys go into criteria, and all rows are looked at once.
    void erase(std::span<const std::uint64_t> ids) override
    {
        std::string criteria = fmt::format("id in ({})", fmt::join(ids, ","));
        check(rg_delete_rows_1(rows_, criteria.data()), "delete by keys");
        commit(rows_);
    }

    void erase(filter wanted) override
    {
        check(rg_delete_rows_1(rows_, const_cast<char *>(criteria_of(wanted))), "delete by criteria");
        commit(rows_);
    }

    void erase_all() override
    {
        check(rg_delete_rows_1(rows_, nullptr), "delete");
        commit(rows_);
    }

    // Updates must not follow before the table has been closed and opened; reads and other column changes may.
    void add_column() override
    {
        rg_column_t added             = column(Added, KT_INT64, false);
        added.default_value.val_int64 = added_default;
        check(rg_add_columns_1(rows_, &added, 1), "add column");
    }

    void drop_column() override
    {
        kt_char_ptr_t names[]{Added};
        check(rg_delete_columns_1(rows_, names, 1), "delete column");
    }

    std::uint64_t sum_added() override
    {
        std::uint64_t     sum   = 0;
        const kt_uint32_t total = rows_of(rows_);
        for (kt_uint32_t i = 0; i < total; ++i) {
            kt_value_t value;
            check(rg_get_field_by_index_1(rows_, static_cast<kt_int32_t>(i), Added, &value), "get added");
            sum += digest(value.val_int64);
        }
        return sum;
    }

    std::uint64_t read(std::span<const std::uint64_t> ids, field wanted, scope) override
    {
        return read_keys(ids, wanted, [](std::uint64_t id) { return value_of(id); });
    }

    std::uint64_t read(std::span<const name_text> names, field wanted, scope) override
    {
        if (where_.found_by == layout::by_name)
            return read_keys(names, wanted, [](const name_text & name) { return value_of(name); });
        return read_keys(names, wanted, [this](const name_text & name) {
            kt_value_t id;
            check(rg_get_field_by_key_1(names_, value_of(name), Id, &id), "get id");
            return id;
        });
    }

    std::uint64_t read_all() override { return digest_of(rows_); }

    std::unique_ptr<store> share() override { return std::make_unique<kt_rg_store>(this); }

    // There is no counting: the rows' indices are listed.
    std::size_t count(filter wanted) override { return list(const_cast<char *>(criteria_of(wanted))); }

    std::size_t copy(filter wanted) override
    {
        check(rg_select_1(rows_, nullptr, 0, &copy_, const_cast<char *>(criteria_of(wanted))), "select");
        return rows_of(copy_);
    }

    std::uint64_t drop_copy() override
    {
        const std::uint64_t sum = digest_of(copy_);
        check(rg_close_table_1(copy_), "close");
        return sum;
    }

  private:
    rg_opaque_handle_t open(kt_char_ptr_t p_path, std::span<rg_column_t> definitions, bool by_name, access how)
    {
        const hashing      h     = hashing_for(by_name, where_.rows);
        const auto         total = static_cast<kt_uint32_t>(definitions.size());
        const kt_int32_t   mode  = how == access::read ? RG_MODE_READ : RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
        rg_opaque_handle_t table = nullptr;
        if (how == access::create)
            check(hashed_ ? rg_create_hashed_key_table_1(tree_, p_path, definitions.data(), total, mode, h.buckets,
                                                         h.p_hash, h.p_compare, &table)
                          : rg_create_table_1(tree_, p_path, definitions.data(), total, mode, &table),
                  "create");
        else
            check(hashed_ ? rg_open_hashed_key_table_1(tree_, p_path, mode, h.buckets, h.p_hash, h.p_compare, &table)
                          : rg_open_table_1(tree_, p_path, mode, &table),
                  "open");
        return table;
    }

    void insert_names(std::span<const row> rows)
    {
        kt_value_t    values[2];
        kt_value_t *  pointers[]{&values[0], &values[1]};
        kt_char_ptr_t names[]{Name, Id};
        for (const row & r : rows) {
            values[0] = value_of(r.name);
            values[1] = value_of(r.id);
            check(rg_add_row_1(names_, names, pointers, 2), "add name");
        }
        commit(names_);
    }

    void commit(rg_opaque_handle_t table)
    {
        check(rg_apply_1(table, 0), "apply");
        check(rg_commit_1(table), "commit");
    }

    template <class Keys, class Lookup> std::uint64_t read_keys(Keys keys, field wanted, Lookup key_of)
    {
        std::uint64_t sum = 0;
        kt_value_t    value;
        if (wanted == field::count) {
            for (const auto & key : keys) {
                check(rg_get_field_by_key_1(rows_, key_of(key), Count, &value), "get count");
                sum += digest(value.val_int64);
            }
            return sum;
        }
        for (const auto & key : keys) {
            check(rg_get_field_by_key_1(rows_, key_of(key), Note, &value), "get note");
            sum += digest(std::string_view(value.ptr_char));
            std::free(value.ptr_char);
        }
        return sum;
    }

    // The call takes a variable argument list, of which criteria without variables read nothing.
    std::size_t list(kt_char_ptr_t p_criteria, ...)
    {
        kt_uint32_t   total  = 0;
        kt_uint32_t * p_rows = nullptr;
        va_list       ap;
        va_start(ap, p_criteria);
        const kt_int32_t code = rg_get_selected_rows_v_1(rows_, p_criteria, ap, 0, &total, &p_rows);
        va_end(ap);
        check(code, "list");
        std::free(p_rows);
        return total;
    }

    static kt_uint32_t rows_of(rg_opaque_handle_t table)
    {
        rg_table_metadata_t * p_metadata = nullptr;
        check(rg_get_table_metadata_1(table, 0, &p_metadata), "describe");
        const kt_uint32_t total = p_metadata->number_of_rows;
        rg_free_table_metadata_1(p_metadata);
        return total;
    }

    static std::uint64_t digest_of(rg_opaque_handle_t table)
    {
        row_values        r;
        std::uint64_t     sum   = 0;
        const kt_uint32_t total = rows_of(table);
        for (kt_uint32_t i = 0; i < total; ++i) {
            check(rg_get_fields_by_index_1(table, static_cast<kt_int32_t>(i), r.names, r.pointers, columns), "get row");
            sum += digest(r.values[0].val_uint64, r.values[1].val_int64, r.values[2].val_float64, r.values[3].ptr_char,
                          r.values[4].ptr_char);
            std::free(r.values[3].ptr_char);
            std::free(r.values[4].ptr_char);
        }
        return sum;
    }

    place              where_;
    bool               hashed_;
    bool               owner_;
    rg_opaque_handle_t tree_  = nullptr;
    rg_opaque_handle_t rows_  = nullptr;
    rg_opaque_handle_t names_ = nullptr; // from name to id, if rows are found by both
    rg_opaque_handle_t copy_  = nullptr;
};

} // namespace

std::unique_ptr<store> open_kt_rg(const place & where, access how)
{
    return std::make_unique<kt_rg_store>(where, how, true);
}

std::unique_ptr<store> open_kt_rg_plain(const place & where, access how)
{
    return std::make_unique<kt_rg_store>(where, how, false);
}

} // namespace peers
