// SPDX-License-Identifier: MIT
// whole_bench: what it costs to copy a whole table. The argument is the number of rows: an integer key, a 16-byte
// string and an integer. To compare two builds, run both with --benchmark_repetitions=5 and look at the medians.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include "kt_rg.h"

namespace
{

void must(kt_int32_t rc, const char * p_what)
{
    if (rc != 0) {
        std::fprintf(stderr, "whole_bench: %s: %d\n", p_what, rc);
        std::abort();
    }
}

kt_uint32_t hash_key(void * p_key)
{
    kt_uint32_t key;
    std::memcpy(&key, p_key, sizeof key);
    return (key * 2654435761u) >> 12;
}

kt_int32_t compare_keys(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(kt_uint32_t));
}

constexpr kt_uint32_t buckets = 1u << 20;

char key_name[] = "key", string_name[] = "string", number_name[] = "number";
char source_path[] = "/source", copy_path[] = "/copy", mount_path[] = "/files", file_path[] = "/files/copy";
char some_text[] = "sixteen bytes it";

rg_opaque_handle_t filled(rg_opaque_handle_t tree, std::int64_t rows, bool hashed)
{
    rg_column_t columns[3]{};
    columns[0]               = {key_name, KT_UINT32, RG_PRIMARY_KEY_NOCHECK, 0, nullptr, {}};
    columns[1]               = {string_name, KT_CHAR_PTR, RG_STANDARD, 0, nullptr, {}};
    columns[2]               = {number_name, KT_INT64, RG_STANDARD, 0, nullptr, {}};
    rg_opaque_handle_t table = nullptr;
    const kt_int32_t   mode  = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    must(hashed ? rg_create_hashed_key_table_1(tree, source_path, columns, 3, mode, buckets, hash_key, compare_keys,
                                               &table)
                : rg_create_table_1(tree, source_path, columns, 3, mode, &table),
         "create");
    kt_char_ptr_t names[]{key_name, string_name, number_name};
    kt_value_t    values[3]{};
    kt_value_t *  pointers[]{&values[0], &values[1], &values[2]};
    values[1].ptr_char = some_text;
    for (std::int64_t row = 0; row < rows; ++row) {
        values[0].val_uint32 = static_cast<kt_uint32_t>(row);
        values[2].val_int64  = row;
        must(rg_add_row_1(table, names, pointers, 3), "add");
    }
    must(rg_apply_1(table, 0), "apply");
    must(rg_commit_1(table), "commit");
    return table;
}

void copy_in_memory(benchmark::State & state, bool hashed)
{
    rg_opaque_handle_t tree = nullptr;
    must(rg_open_tree_1(&tree, 0, 0), "open tree");
    rg_opaque_handle_t source = filled(tree, state.range(0), hashed);
    for (auto _ : state) {
        must(rg_copy_table_by_handle_1(source, copy_path, 0), "copy");
        state.PauseTiming();
        must(rg_delete_table_1(tree, copy_path), "delete");
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
    must(rg_close_tree_1(tree), "close");
}

void copy_to_a_file(benchmark::State & state)
{
    std::string directory = (std::filesystem::temp_directory_path() / "whole_bench.XXXXXX").string();
    if (mkdtemp(directory.data()) == nullptr)
        must(1, "mkdtemp");
    rg_opaque_handle_t tree = nullptr;
    must(rg_open_tree_1(&tree, 0, 0), "open tree");
    must(rg_mount_local_tree_1(tree, mount_path, directory.data(), 1), "mount");
    rg_opaque_handle_t source = filled(tree, state.range(0), false);
    for (auto _ : state)
        must(rg_copy_table_by_handle_1(source, file_path, 1), "copy");
    state.SetItemsProcessed(state.iterations() * state.range(0));
    must(rg_close_tree_1(tree), "close");
    std::filesystem::remove_all(directory);
}

BENCHMARK_CAPTURE(copy_in_memory, without_hash_table, false)
    ->Arg(10000)
    ->Arg(1000000)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();
BENCHMARK_CAPTURE(copy_in_memory, with_hash_table, true)
    ->Arg(10000)
    ->Arg(1000000)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();
BENCHMARK(copy_to_a_file)->Arg(10000)->Arg(1000000)->Unit(benchmark::kMillisecond)->UseRealTime();

} // namespace

BENCHMARK_MAIN();
