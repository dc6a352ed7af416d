// SPDX-License-Identifier: MIT
// road_bench: what the main road costs: reading by key, adding rows, updating them, and opening files.
//
// Each workload checks what it measured. Compare two builds by running both with
//     road_bench --benchmark_repetitions=5 --benchmark_report_aggregates_only=true
// one after the other on a quiet machine, and looking at the medians. Sizes are the arguments behind the names: rows,
// or updates. Files go to TMPDIR, or /tmp.
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "kt_ku.h"
#include "kt_rg.h"

namespace
{

void require(bool condition, const char * p_what)
{
    if (condition)
        return;
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    std::fprintf(stderr, "road_bench: %s: %s\n", p_what, record.p_text);
    std::abort();
}

// ---- A table of five columns: 80 bytes a row in the file ----

kt_uint32_t Buckets = 1u << 20;

kt_uint32_t hash_id(void * p_key)
{
    kt_uint32_t key;
    std::memcpy(&key, p_key, sizeof key);
    return (key * 2654435761u) & (Buckets - 1);
}

kt_int32_t compare_ids(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(kt_uint32_t));
}

char Names[5][8]{"id", "size", "ratio", "kind", "name"};

kt_value_t uint32_value(kt_uint32_t v)
{
    kt_value_t value{};
    value.val_uint32 = v;
    return value;
}

struct row_t {
    row_t()
    {
        std::memset(values, 0, sizeof values);
        for (int i = 0; i < 5; ++i) {
            names[i]    = Names[i];
            pointers[i] = &values[i];
        }
        values[4].ptr_char = text;
    }

    void become(kt_uint32_t id)
    {
        values[0].val_uint32  = id;
        values[1].val_int64   = std::int64_t{id} * 3;
        values[2].val_float64 = id * 0.5;
        values[3].val_int32   = static_cast<kt_int32_t>(id % 7);
        std::snprintf(text, sizeof text, "name-%010u-abcdef", id); // 22 characters
    }

    kt_int32_t add_to(rg_opaque_handle_t table) { return rg_add_row_1(table, names, pointers, 5); }

    kt_char_ptr_t names[5];
    kt_value_t    values[5];
    kt_value_t *  pointers[5];
    char          text[32]{};
};

struct registry {
    registry()
    {
        std::string pattern = (std::filesystem::temp_directory_path() / "road_bench.XXXXXX").string();
        require(mkdtemp(pattern.data()) != nullptr, "directory");
        directory = pattern;
        require(rg_open_tree_1(&tree, 0, 0) == 0, "open tree");
        char path[]{"/m"};
        require(rg_mount_local_tree_1(tree, path, directory.data(), 1) == 0, "mount");
    }

    ~registry()
    {
        rg_close_tree_1(tree);
        std::filesystem::remove_all(directory);
    }

    registry(const registry &)             = delete;
    registry & operator=(const registry &) = delete;

    rg_opaque_handle_t create(const char * p_path, bool hashed, kt_uint32_t rows)
    {
        rg_column_t          columns[5]{};
        const kt_data_type_t types[5]{KT_UINT32, KT_INT64, KT_FLOAT64, KT_INT32, KT_CHAR_PTR};
        for (int i = 0; i < 5; ++i)
            columns[i] = {Names[i], types[i], i == 0 ? kt_uint32_t{RG_PRIMARY_KEY} : kt_uint32_t{RG_STANDARD},
                          0,        nullptr,  {}};
        if (!hashed)
            columns[0].qualifier = RG_PRIMARY_KEY_NOCHECK; // a check without a hash table looks at every row
        std::string        path  = p_path;
        rg_opaque_handle_t table = nullptr;
        const kt_int32_t   mode  = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
        Buckets                  = 1024;
        while (Buckets < rows)
            Buckets *= 2;
        if (hashed)
            require(rg_create_hashed_key_table_1(tree, path.data(), columns, 5, mode, Buckets, hash_id, compare_ids,
                                                 &table) == 0,
                    "create");
        else
            require(rg_create_table_1(tree, path.data(), columns, 5, mode, &table) == 0, "create");
        return table;
    }

    rg_opaque_handle_t open(const char * p_path, kt_int32_t mode)
    {
        std::string        path  = p_path;
        rg_opaque_handle_t table = nullptr;
        require(rg_open_table_1(tree, path.data(), mode, &table) == 0, "open");
        return table;
    }

    rg_opaque_handle_t tree = nullptr;
    std::string        directory;
};

void fill(rg_opaque_handle_t table, kt_uint32_t rows)
{
    row_t row;
    for (kt_uint32_t id = 0; id < rows; ++id) {
        row.become(id);
        require(row.add_to(table) == 0, "add");
    }
}

void apply_and_commit(rg_opaque_handle_t table)
{
    require(rg_apply_1(table, 0) == 0, "apply");
    require(rg_commit_1(table) == 0, "commit");
}

// Keys in an order that no cache foresees, the same in each run.
std::vector<kt_uint32_t> shuffled_ids(kt_uint32_t rows)
{
    std::vector<kt_uint32_t> ids(rows);
    kt_uint32_t              state = 12345;
    for (kt_uint32_t i = 0; i < rows; ++i)
        ids[i] = i;
    for (kt_uint32_t i = rows - 1; i > 0; --i) {
        state = state * 1664525u + 1013904223u;
        std::swap(ids[i], ids[state % (i + 1)]);
    }
    return ids;
}

std::size_t resident_bytes()
{
    std::ifstream status("/proc/self/statm");
    std::size_t   total    = 0;
    std::size_t   resident = 0;
    status >> total >> resident;
    return resident * static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
}

// ---- Reading ----

// An integer column of a row by its key; uncontended, on a hashed table of so many rows.
void read_integer_by_key(benchmark::State & state)
{
    const auto               rows = static_cast<kt_uint32_t>(state.range(0));
    registry                 r;
    const rg_opaque_handle_t table = r.create("/t", true, rows);
    fill(table, rows);
    apply_and_commit(table);
    const std::vector<kt_uint32_t> ids = shuffled_ids(rows);
    std::size_t                    i   = 0;
    kt_value_t                     value{};
    for (auto _ : state) {
        const kt_uint32_t id = ids[i];
        i                    = i + 1 == rows ? 0 : i + 1;
        if (rg_get_field_by_key_1(table, uint32_value(id), Names[1], &value) != 0 ||
            value.val_int64 != std::int64_t{id} * 3)
            require(false, "read");
    }
}
BENCHMARK(read_integer_by_key)->Arg(1000)->Arg(100'000)->Arg(1'000'000);

// A string of 16 bytes, in a block of its own each time.
void read_string_by_key(benchmark::State & state)
{
    const auto               rows = static_cast<kt_uint32_t>(state.range(0));
    registry                 r;
    const rg_opaque_handle_t table = r.create("/t", true, rows);
    row_t                    row;
    for (kt_uint32_t id = 0; id < rows; ++id) {
        row.become(id);
        std::snprintf(row.text, sizeof row.text, "%016u", id);
        require(row.add_to(table) == 0, "add");
    }
    apply_and_commit(table);
    const std::vector<kt_uint32_t> ids = shuffled_ids(rows);
    std::size_t                    i   = 0;
    kt_value_t                     value{};
    for (auto _ : state) {
        const kt_uint32_t id = ids[i];
        i                    = i + 1 == rows ? 0 : i + 1;
        if (rg_get_field_by_key_1(table, uint32_value(id), Names[4], &value) != 0 || value.ptr_char[16] != '\0')
            require(false, "read");
        std::free(value.ptr_char);
    }
}
BENCHMARK(read_string_by_key)->Arg(1000)->Arg(100'000)->Arg(1'000'000);

// ---- Adding and updating ----

// So many rows of five columns into a fresh hashed table, under explicit control. The figure is a row's.
void add_rows(benchmark::State & state)
{
    const auto rows = static_cast<kt_uint32_t>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        auto                     p_registry = std::make_unique<registry>();
        const rg_opaque_handle_t table      = p_registry->create("/t", true, rows);
        state.ResumeTiming();
        fill(table, rows);
        state.PauseTiming();
        kt_value_t value{};
        require(rg_get_field_by_key_and_visibility_1(table, uint32_value(rows - 1), Names[1], &value, 1, nullptr) ==
                        0 &&
                    value.val_int64 == std::int64_t{rows - 1} * 3,
                "check");
        p_registry.reset();
        state.ResumeTiming();
    }
    state.counters["ns_a_row"] = benchmark::Counter(
        static_cast<double>(rows), benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}
BENCHMARK(add_rows)->Arg(1000)->Arg(100'000)->Arg(1'000'000)->Unit(benchmark::kMillisecond);

// The id in so many digits. Quicker than printing, which would be a good part of what is measured.
void write_digits(char * p_text, std::size_t digits, kt_uint32_t id)
{
    p_text[digits] = '\0';
    for (; digits > 0; id /= 10)
        p_text[--digits] = static_cast<char>('0' + id % 10);
}

// One field of rows all over a hashed table of so many rows, under explicit control, committed every thousand updates;
// ahead of it a million updates have broken up the pool.
void set_field_by_key(benchmark::State & state)
{
    const auto               rows = static_cast<kt_uint32_t>(state.range(0));
    registry                 r;
    const rg_opaque_handle_t table = r.create("/t", true, rows);
    fill(table, rows);
    apply_and_commit(table);
    const std::vector<kt_uint32_t> ids = shuffled_ids(rows);
    std::size_t                    i   = 0;
    char                           text[64];
    kt_value_t                     value{};
    value.ptr_char    = text;
    const auto update = [&] {
        const kt_uint32_t id = ids[i % rows];
        write_digits(text, 8 + i * 7 % 40, id); // records of many lengths
        require(rg_set_field_by_key_1(table, uint32_value(id), Names[4], &value) == 0, "set");
        ++i;
    };
    for (int n = 0; n < 1'000'000; ++n) {
        update();
        if (n % 1000 == 999)
            apply_and_commit(table);
    }
    int n = 0;
    for (auto _ : state) {
        update();
        if (++n % 1000 == 0) {
            state.PauseTiming();
            apply_and_commit(table);
            state.ResumeTiming();
        }
    }
    apply_and_commit(table);
    kt_value_t last{};
    require(rg_get_field_by_key_1(table, uint32_value(ids[(i - 1) % rows]), Names[4], &last) == 0 &&
                std::strcmp(last.ptr_char, text) == 0,
            "check");
    std::free(last.ptr_char);
}
BENCHMARK(set_field_by_key)->Arg(1000)->Arg(100'000)->Arg(1'000'000);

// One row in a transaction of its own on a kept table: two syncs.
void add_row_durably(benchmark::State & state)
{
    registry                 r;
    const rg_opaque_handle_t table = r.create("/m/t", false, 1000);
    row_t                    row;
    kt_uint32_t              id = 0;
    for (auto _ : state) {
        row.become(id++);
        require(row.add_to(table) == 0, "add");
        apply_and_commit(table);
    }
}
BENCHMARK(add_row_durably)->Unit(benchmark::kMicrosecond);

// ---- Opening ----

void report_open(benchmark::State & state, registry & r, const std::string & file, kt_uint32_t rows)
{
    const std::size_t before = resident_bytes();
    const auto        table  = r.open("/m/t", RG_MODE_READ);
    const std::size_t taken  = resident_bytes() - before;
    require(rg_close_table_1(table) == 0, "close");
    const auto file_bytes            = static_cast<double>(std::filesystem::file_size(file));
    state.counters["file_bytes"]     = file_bytes;
    state.counters["resident_bytes"] = static_cast<double>(taken);
    state.counters["of_allowed"]     = static_cast<double>(taken) / (1.6 * file_bytes + 150.0 * rows);
}

// A file of so many rows of 80 bytes.
void open_rows(benchmark::State & state)
{
    const auto rows = static_cast<kt_uint32_t>(state.range(0));
    registry   r;
    {
        const rg_opaque_handle_t table = r.create("/m/t", false, rows);
        fill(table, rows);
        apply_and_commit(table);
        require(rg_close_table_1(table) == 0, "close");
    }
    for (auto _ : state) {
        const rg_opaque_handle_t table = r.open("/m/t", RG_MODE_READ);
        state.PauseTiming();
        kt_value_t value{};
        require(rg_get_field_by_index_1(table, static_cast<kt_int32_t>(rows - 1), Names[1], &value) == 0 &&
                    value.val_int64 == std::int64_t{rows - 1} * 3,
                "check");
        require(rg_close_table_1(table) == 0, "close");
        state.ResumeTiming();
    }
    report_open(state, r, r.directory + "/t", rows);
}
BENCHMARK(open_rows)->Arg(10'000)->Arg(100'000)->Arg(1'000'000)->Unit(benchmark::kMillisecond);

// A file that holds so many updates of the same 1,000 rows.
void open_updates(benchmark::State & state)
{
    constexpr kt_uint32_t rows    = 1000;
    const auto            updates = static_cast<kt_uint32_t>(state.range(0));
    registry              r;
    {
        const rg_opaque_handle_t table = r.create("/m/t", true, rows);
        fill(table, rows);
        apply_and_commit(table);
        kt_value_t value{};
        for (kt_uint32_t n = 0; n < updates; ++n) {
            value.val_int64 = n;
            require(rg_set_field_by_index_1(table, static_cast<kt_int32_t>(n % rows), Names[1], &value) == 0, "set");
            if (n % rows == rows - 1)
                apply_and_commit(table);
        }
        require(rg_close_table_1(table) == 0, "close");
    }
    for (auto _ : state) {
        const rg_opaque_handle_t table = r.open("/m/t", RG_MODE_READ);
        state.PauseTiming();
        kt_value_t value{};
        require(rg_get_field_by_index_1(table, 5, Names[1], &value) == 0 && value.val_int64 == updates - rows + 5,
                "check");
        require(rg_close_table_1(table) == 0, "close");
        state.ResumeTiming();
    }
    report_open(state, r, r.directory + "/t", rows);
}
BENCHMARK(open_updates)->Arg(20'000)->Arg(200'000)->Unit(benchmark::kMillisecond);

} // namespace

BENCHMARK_MAIN();
