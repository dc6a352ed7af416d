// SPDX-License-Identifier: MIT
// pack_bench: packing, converting and unpacking 100,000 rows of five columns. bytes_per_second counts bytes of buffer.
//
// Compare two builds: pack_bench --benchmark_repetitions=5 --benchmark_report_aggregates_only, and look at the medians.
#include <benchmark/benchmark.h>
#include <malloc.h>

#include <cstdlib>
#include <cstring>
#include <iterator>
#include <string>
#include <vector>

#include "kt_rg.h"

namespace
{

constexpr kt_uint32_t total_rows    = 100000;
constexpr kt_uint32_t total_buckets = 131072;

// Benchmarks check what they measure.
void require(bool condition)
{
    if (!condition)
        std::abort();
}

kt_uint32_t hash_id(void * p_key)
{
    kt_uint32_t id;
    std::memcpy(&id, p_key, sizeof id);
    return (id * 2654435761u) % total_buckets;
}

kt_int32_t compare_ids(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(kt_uint32_t));
}

kt_char_ptr_t writable(const char * p_text)
{
    return const_cast<kt_char_ptr_t>(p_text);
}

rg_opaque_handle_t make_table(rg_opaque_handle_t tree, rg_qualifier_t key_qualifier)
{
    kt_value_t none;
    std::memset(&none, 0, sizeof none);
    rg_column_t   columns[] = {{writable("id"), KT_UINT32, key_qualifier, 0, nullptr, none},
                               {writable("name"), KT_CHAR_PTR, RG_STANDARD, 0, nullptr, none},
                               {writable("size"), KT_INT64, RG_STANDARD, 0, nullptr, none},
                               {writable("ratio"), KT_FLOAT64, RG_STANDARD, 0, nullptr, none},
                               {writable("text"), KT_CHAR_PTR, RG_STANDARD, 0, nullptr, none}};
    kt_char_ptr_t names[5];
    for (int c = 0; c < 5; ++c)
        names[c] = columns[c].name;

    rg_opaque_handle_t table = nullptr;
    require(rg_create_hashed_key_table_1(tree, writable("table"), columns, 5, RG_MODE_EXPLICIT_CONTROL, total_buckets,
                                         hash_id, compare_ids, &table) == 0);
    for (kt_uint32_t row = 0; row < total_rows; ++row) {
        std::string name      = "name" + std::to_string(1000000000 + row);
        std::string text      = "a text of forty bytes, as descriptions go";
        kt_value_t  values[5] = {none, none, none, none, none};
        values[0].val_uint32  = row;
        values[1].ptr_char    = name.data();
        values[2].val_int64   = row * kt_int64_t{1000};
        values[3].val_float64 = row / 7.0;
        values[4].ptr_char    = text.data();
        kt_value_t * pointers[5];
        for (int c = 0; c < 5; ++c)
            pointers[c] = &values[c];
        require(rg_add_row_1(table, names, pointers, 5) == 0);
    }
    require(rg_apply_1(table, 0) == 0 && rg_commit_1(table) == 0);
    return table;
}

void * pack(rg_opaque_handle_t table)
{
    kt_uint32_t zero     = 0;
    void *      p_buffer = nullptr;
    require(rg_pack_tables_1(1, &table, &zero, &zero, nullptr, &p_buffer) == 0);
    return p_buffer;
}

kt_uint32_t length_of(const void * p_buffer)
{
    kt_uint32_t length;
    std::memcpy(&length, p_buffer, sizeof length);
    return length;
}

struct packed_table {
    explicit packed_table(rg_qualifier_t key_qualifier)
    {
        require(rg_open_tree_1(&tree, 0, 0) == 0);
        table    = make_table(tree, key_qualifier);
        p_buffer = pack(table);
        length   = length_of(p_buffer);
    }
    ~packed_table()
    {
        std::free(p_buffer);
        forget_sender();
    }
    // Leaves the buffer alone, on a heap without the pieces of the table, as a receiver has it.
    void forget_sender()
    {
        if (tree != nullptr)
            rg_close_tree_1(tree);
        tree = nullptr;
        malloc_trim(0);
    }
    void count_bytes(benchmark::State & state) const
    {
        state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations()) * length);
        state.counters["buffer_bytes"] = length;
    }

    rg_opaque_handle_t tree     = nullptr;
    rg_opaque_handle_t table    = nullptr;
    void *             p_buffer = nullptr;
    kt_uint32_t        length   = 0;
};

// A whole table into a new buffer, as a caller would: the buffer is freed again.
void packing(benchmark::State & state)
{
    const packed_table source(RG_PRIMARY_KEY);
    for (auto _ : state) {
        void * p_buffer = pack(source.table);
        require(length_of(p_buffer) == source.length);
        std::free(p_buffer);
    }
    source.count_bytes(state);
}
BENCHMARK(packing)->Unit(benchmark::kMillisecond);

// A buffer into a table of a tree, hashed with a unique key or unhashed with one that isn't checked. Taking the table
// down isn't counted, and each one is made on a heap without the pieces of the one before, as a receiver's is.
void unpacking(benchmark::State & state)
{
    const bool   hashed = state.range(0) != 0;
    packed_table source(hashed ? RG_PRIMARY_KEY : RG_PRIMARY_KEY_NOCHECK);
    source.forget_sender();
    for (auto _ : state) {
        state.PauseTiming();
        rg_opaque_handle_t tree = nullptr, table = nullptr;
        require(rg_open_tree_1(&tree, 0, 0) == 0);
        state.ResumeTiming();
        require(rg_unpack_table_1(source.p_buffer, hashed ? total_buckets : 0, hash_id, compare_ids, tree, 0, &table) ==
                0);
        state.PauseTiming();
        kt_value_t value;
        require(rg_get_field_by_index_1(table, total_rows - 1, writable("id"), &value) == 0);
        require(value.val_uint32 == total_rows - 1);
        require(rg_close_tree_1(tree) == 0);
        malloc_trim(0);
        state.ResumeTiming();
    }
    source.count_bytes(state);
}
BENCHMARK(unpacking)->ArgName("hashed")->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond);

} // namespace

BENCHMARK_MAIN();
