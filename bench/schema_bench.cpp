// SPDX-License-Identifier: MIT
// schema_bench: what a change of columns costs. The argument is the number of rows of five columns: an integer key, an
// integer, a floating point number, a string of 16 bytes and one of 40. Each change works on a table that is as fresh
// as the first one: in memory on a new copy, in a file behind the change that takes the last one back. To compare two
// builds, run both with --benchmark_repetitions=5 and look at the medians of the CPU time; a file's change waits for the
// disk besides.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include "common/kt_rg_rows.h"
#include "kt_rg.h"

namespace
{

void must(kt_int32_t rc, const char * p_what)
{
    if (rc != 0) {
        std::fprintf(stderr, "schema_bench: %s: %d\n", p_what, rc);
        std::abort();
    }
}

char id_name[] = "id", count_name[] = "count", ratio_name[] = "ratio", name_name[] = "name", note_name[] = "note";
char extra_name[]  = "extra";
char source_path[] = "/source", work_path[] = "/work", mount_path[] = "/files", file_path[] = "/files/table";
char short_text[] = "sixteen bytes it", long_text[] = "a text of forty bytes, terminator apart.";

enum class key { hashed, unchecked, checked };

rg_opaque_handle_t filled(rg_opaque_handle_t tree, char * p_path, std::int64_t rows, key kind)
{
    rg_column_t columns[5]{};
    columns[0] = {id_name, KT_UINT64, kind == key::unchecked ? RG_PRIMARY_KEY_NOCHECK : RG_PRIMARY_KEY, 0, nullptr, {}};
    columns[1] = {count_name, KT_INT64, RG_STANDARD, 0, nullptr, {}};
    columns[2] = {ratio_name, KT_FLOAT64, RG_STANDARD, 0, nullptr, {}};
    columns[3] = {name_name, KT_CHAR_PTR, RG_STANDARD, 0, nullptr, {}};
    columns[4] = {note_name, KT_CHAR_PTR, RG_STANDARD, 0, nullptr, {}};
    rg_opaque_handle_t   table = nullptr;
    const kt_int32_t     mode  = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
    const bench::hashing h     = bench::hashing_for(false, static_cast<std::size_t>(rows));
    must(kind == key::hashed
             ? rg_create_hashed_key_table_1(tree, p_path, columns, 5, mode, h.buckets, h.p_hash, h.p_compare, &table)
             : rg_create_table_1(tree, p_path, columns, 5, mode, &table),
         "create");
    kt_char_ptr_t names[]{id_name, count_name, ratio_name, name_name, note_name};
    kt_value_t    values[5]{};
    kt_value_t *  pointers[]{&values[0], &values[1], &values[2], &values[3], &values[4]};
    values[3].ptr_char = short_text;
    values[4].ptr_char = long_text;
    for (std::int64_t row = 0; row < rows; ++row) {
        values[0].val_uint64  = static_cast<kt_uint64_t>(row);
        values[1].val_int64   = row * 7;
        values[2].val_float64 = static_cast<double>(row) / 3;
        must(rg_add_row_1(table, names, pointers, 5), "add row");
    }
    must(rg_apply_1(table, 0), "apply");
    must(rg_commit_1(table), "commit");
    return table;
}

void add_column(rg_opaque_handle_t table)
{
    rg_column_t extra{extra_name, KT_INT64, RG_STANDARD, 0, nullptr, {}};
    must(rg_add_columns_1(table, &extra, 1), "add column");
}

void drop_column(rg_opaque_handle_t table, kt_char_ptr_t p_name)
{
    must(rg_delete_columns_1(table, &p_name, 1), "delete column");
}

template <class Change> void change_in_memory(benchmark::State & state, key kind, Change && change)
{
    rg_opaque_handle_t tree = nullptr;
    must(rg_open_tree_1(&tree, 0, 0), "open tree");
    rg_opaque_handle_t source = filled(tree, source_path, state.range(0), kind);
    for (auto _ : state) {
        state.PauseTiming();
        must(rg_copy_table_by_handle_1(source, work_path, 0), "copy");
        rg_opaque_handle_t table = nullptr;
        must(rg_open_table_1(tree, work_path, RG_MODE_WRITE, &table), "open");
        state.ResumeTiming();
        change(table);
        state.PauseTiming();
        must(rg_close_table_1(table), "close");
        must(rg_delete_table_1(tree, work_path), "delete");
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
    must(rg_close_tree_1(tree), "close tree");
}

template <class Change, class TakeBack>
void change_in_a_file(benchmark::State & state, Change && change, TakeBack && take_back)
{
    std::string directory = (std::filesystem::temp_directory_path() / "schema_bench.XXXXXX").string();
    if (mkdtemp(directory.data()) == nullptr)
        must(1, "mkdtemp");
    rg_opaque_handle_t tree = nullptr;
    must(rg_open_tree_1(&tree, 0, 0), "open tree");
    must(rg_mount_local_tree_1(tree, mount_path, directory.data(), 1), "mount");
    rg_opaque_handle_t table = filled(tree, file_path, state.range(0), key::hashed);
    for (auto _ : state) {
        change(table);
        state.PauseTiming();
        take_back(table);
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
    must(rg_close_tree_1(tree), "close tree");
    std::filesystem::remove_all(directory);
}

void add_in_memory(benchmark::State & state, key kind)
{
    change_in_memory(state, kind, add_column);
}

void drop_in_memory(benchmark::State & state, key kind)
{
    change_in_memory(state, kind, [](rg_opaque_handle_t table) { drop_column(table, count_name); });
}

void add_in_a_file(benchmark::State & state)
{
    change_in_a_file(state, add_column, [](rg_opaque_handle_t table) { drop_column(table, extra_name); });
}

void drop_in_a_file(benchmark::State & state)
{
    change_in_a_file(
        state, [](rg_opaque_handle_t table) { drop_column(table, note_name); },
        [](rg_opaque_handle_t table) {
            rg_column_t note{note_name, KT_CHAR_PTR, RG_STANDARD, 0, nullptr, {}};
            note.default_value.ptr_char = long_text;
            must(rg_add_columns_1(table, &note, 1), "add column");
        });
}

BENCHMARK_CAPTURE(add_in_memory, hashed_key, key::hashed)
    ->Arg(1000)
    ->Arg(100000)
    ->Arg(1000000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(add_in_memory, key_that_is_not_checked, key::unchecked)->Arg(100000)->Unit(benchmark::kMillisecond);
// More rows of such a key take too long to make: each added row looks at all rows ahead of it.
BENCHMARK_CAPTURE(add_in_memory, key_without_hash_table, key::checked)->Arg(10000)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(drop_in_memory, hashed_key, key::hashed)->Arg(1000)->Arg(100000)->Unit(benchmark::kMillisecond);
BENCHMARK(add_in_a_file)->Arg(1000)->Arg(100000)->Unit(benchmark::kMillisecond);
BENCHMARK(drop_in_a_file)->Arg(1000)->Arg(100000)->Unit(benchmark::kMillisecond);

} // namespace

BENCHMARK_MAIN();
