// SPDX-License-Identifier: MIT
#include "tables.h"

#include <algorithm>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <numeric>
#include <random>

#include "common/machine.h"
#include "common/require.h"

namespace growth
{

namespace
{

constexpr std::size_t longest_note = 120;
constexpr std::size_t most_sampled = 1 << 18;

// Total different rows' numbers, of all below rows.
std::vector<std::uint32_t> some_of(std::size_t rows)
{
    scattered                  order(rows);
    std::vector<std::uint32_t> chosen(std::min(rows, most_sampled));
    for (std::uint32_t & number : chosen)
        number = static_cast<std::uint32_t>(order.next());
    std::shuffle(chosen.begin(), chosen.end(), std::mt19937_64(rows));
    return chosen;
}

} // namespace

void apply_and_commit(rg_opaque_handle_t table)
{
    check(rg_apply_1(table, 0), "apply");
    check(rg_commit_1(table), "commit");
}

void settle_heap()
{
    constexpr int         enough = 2'000;
    constexpr std::size_t large  = 1 << 20;
    for (int i = 0; i < enough; ++i) {
        void * p_block = std::malloc(large);
        use(p_block);
        std::free(p_block);
    }
}

kt_char_ptr_t any_note(std::uint64_t seed)
{
    static char       text[longest_note + 1];
    const std::size_t length = seed * 0x9e3779b97f4a7c15u >> 32u;
    std::memset(text, 'n', longest_note);
    text[length % (longest_note + 1)] = '\0';
    return text;
}

rg_opaque_handle_t create(rg_opaque_handle_t tree, const char * p_path, std::size_t rows, bool hashed)
{
    rg_column_t        definitions[columns]{column(Id, KT_UINT64, true), column(Count, KT_INT64, false),
                                            column(Ratio, KT_FLOAT64, false), column(Name, KT_CHAR_PTR, false),
                                            column(Note, KT_CHAR_PTR, false)};
    const hashing      h     = hashing_for(false, rows);
    rg_opaque_handle_t table = nullptr;
    check(hashed ? rg_create_hashed_key_table_1(tree, path(p_path), definitions, columns, explicit_control, h.buckets,
                                                h.p_hash, h.p_compare, &table)
                 : rg_create_table_1(tree, path(p_path), definitions, columns, explicit_control, &table),
          "create");
    return table;
}

void load(rg_opaque_handle_t table, std::uint64_t first, std::size_t total, bool any_length)
{
    row_values values;
    for (std::uint64_t id = first; id < first + total; ++id) {
        const row r = row_of(id);
        values.become(r);
        if (any_length)
            values.values[4].ptr_char = any_note(id);
        check(rg_add_row_1(table, values.names, values.pointers, columns), "add");
    }
    apply_and_commit(table);
}

std::size_t rows_of(rg_opaque_handle_t table)
{
    rg_table_metadata_t * p_metadata = nullptr;
    check(rg_get_table_metadata_1(table, 0, &p_metadata), "describe");
    const std::size_t rows = p_metadata->number_of_rows;
    rg_free_table_metadata_1(p_metadata);
    return rows;
}

std::vector<std::uint32_t> list(rg_opaque_handle_t table, const char * p_criteria, ...)
{
    kt_uint32_t   total  = 0;
    kt_uint32_t * p_rows = nullptr;
    va_list       ap;
    va_start(ap, p_criteria);
    const kt_int32_t code = rg_get_selected_rows_v_1(table, path(p_criteria), ap, 0, &total, &p_rows);
    va_end(ap);
    check(code, "list");
    std::vector<std::uint32_t> rows(p_rows, p_rows + total);
    std::free(p_rows);
    return rows;
}

scattered::scattered(std::size_t total) : total_(total), step_(total * 618 / 1000 + 1), at_(total / 3)
{
    while (std::gcd(step_, total_) != 1)
        ++step_;
}

std::size_t scattered::next()
{
    at_ = (at_ + step_) % total_;
    return at_;
}

table_in_memory::table_in_memory(std::size_t rows, state s, bool hashed) : rows_(rows), state_(s)
{
    check(rg_open_tree_1(&tree_, 0, 0), "open tree");
    table_ = create(tree_, name, rows, hashed);
    if (s == state::churned) {
        churn();
    } else {
        load(table_, 0, rows, false);
        next_id_ = rows;
    }
    require(rows_of(table_) == rows, "a table has other rows than it should");
    settle_heap();
}

table_in_memory::~table_in_memory()
{
    rg_close_tree_1(tree_);
}

void table_in_memory::churn()
{
    const auto add = [this](std::size_t total) {
        load(table_, next_id_, total, true);
        next_id_ += total;
    };
    add(rows_ + rows_ / 8);
    for (int round = 0; round < 2; ++round) {
        delete_some(rows_ / 4);
        set_some(rows_ / 8);
        add(rows_ / 4);
    }
    delete_some(rows_ / 8);
}

void table_in_memory::delete_some(std::size_t total)
{
    std::vector<std::uint32_t> all(rows_of(table_));
    std::iota(all.begin(), all.end(), 0u);
    std::shuffle(all.begin(), all.end(), std::mt19937_64(next_id_));
    for (std::size_t i = 0; i < total; ++i)
        check(rg_delete_row_by_index_1(table_, all[i]), "delete");
    apply_and_commit(table_);
}

void table_in_memory::set_some(std::size_t total)
{
    scattered  order(rows_of(table_));
    kt_value_t note;
    for (std::size_t i = 0; i < total; ++i) {
        note.ptr_char = any_note(next_id_ + i);
        check(rg_set_field_by_index_1(table_, static_cast<kt_int32_t>(order.next()), Note, &note), "set");
    }
    apply_and_commit(table_);
}

sample<std::uint32_t> table_in_memory::fixed_indices() const
{
    const std::vector<std::uint32_t> all    = list(table_, nullptr);
    std::vector<std::uint32_t>       chosen = some_of(rows_);
    for (std::uint32_t & number : chosen)
        number = all[number];
    return sample(std::move(chosen));
}

sample<std::uint32_t> table_in_memory::packed_indices() const
{
    return sample(some_of(rows_));
}

sample<std::uint64_t> table_in_memory::keys() const
{
    std::vector<std::uint64_t> keys;
    for (const std::uint32_t packed : some_of(rows_)) {
        kt_value_t id;
        check(rg_get_field_by_index_1(table_, static_cast<kt_int32_t>(packed), Id, &id), "get id");
        keys.push_back(id.val_uint64);
    }
    return sample(std::move(keys));
}

} // namespace growth
