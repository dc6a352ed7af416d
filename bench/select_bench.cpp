// SPDX-License-Identifier: MIT
// select_bench: what finding rows costs, beside SQLite in memory with the same rows and the same predicate.
//
// Workloads: listing the rows that match (fixed indices here, rowids there), copying them into a result table, and
// deleting all rows by criteria. The arguments behind a name are the rows and the percentage that matches. Each
// workload checks what it counted. Compare the two sides within one run, by their medians:
//     select_bench --benchmark_repetitions=5 --benchmark_report_aggregates_only=true
#include <benchmark/benchmark.h>
#include <sqlite3.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <type_traits>
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
    std::fprintf(stderr, "select_bench: %s: %s\n", p_what, record.p_text);
    std::abort();
}

constexpr int columns = 5;
char          Names[columns][8]{"id", "count", "ratio", "name", "kind"};

// The values of row i, the same on both sides. Every other row has a name that begins with "ab".
struct row_t {
    explicit row_t(unsigned i) : id(i), count(i % 1000), ratio(i % 100 / 100.0), kind(static_cast<int>(i % 7))
    {
        std::snprintf(name, sizeof name, "%s-%010u", i % 2 == 0 ? "ab" : "cd", i);
    }

    unsigned  id;
    long long count; // uniform over 0 to 999
    double    ratio; // uniform over 0.00 to 0.99
    char      name[24];
    int       kind;
};

// ---- This library ----

class registry
{
  public:
    explicit registry(unsigned rows)
    {
        require(rg_open_tree_1(&tree_, 0, 0) == 0, "open tree");
        rg_column_t          definitions[columns]{};
        const kt_data_type_t types[columns]{KT_UINT32, KT_INT64, KT_FLOAT64, KT_CHAR_PTR, KT_INT32};
        for (int i = 0; i < columns; ++i)
            definitions[i] = {
                Names[i], types[i], i == 0 ? kt_uint32_t{RG_PRIMARY_KEY_NOCHECK} : kt_uint32_t{RG_STANDARD},
                0,        nullptr,  {}};
        char path[]{"/t"};
        require(rg_create_table_1(tree_, path, definitions, columns, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL,
                                  &table_) == 0,
                "create");
        for (unsigned i = 0; i < rows; ++i)
            add(row_t(i));
        commit();
    }
    ~registry() { rg_close_tree_1(tree_); }
    registry(const registry &)             = delete;
    registry & operator=(const registry &) = delete;

    [[nodiscard]] rg_opaque_handle_t table() const { return table_; }

    void commit()
    {
        require(rg_apply_1(table_, 0) == 0, "apply");
        require(rg_commit_1(table_) == 0, "commit");
    }

    unsigned list(std::string criteria) { return list_with(criteria.data()); }

    unsigned copy(std::string criteria)
    {
        rg_opaque_handle_t    result     = nullptr;
        rg_table_metadata_t * p_metadata = nullptr;
        require(rg_select_1(table_, nullptr, 0, &result, criteria.data()) == 0, "select");
        require(rg_get_table_metadata_1(result, 0, &p_metadata) == 0, "describe");
        const unsigned rows = p_metadata->number_of_rows;
        rg_free_table_metadata_1(p_metadata);
        require(rg_close_table_1(result) == 0, "close");
        return rows;
    }

  private:
    // The call takes a variable argument list, of which criteria without variables read nothing.
    unsigned list_with(kt_char_ptr_t p_criteria, ...)
    {
        kt_uint32_t   total  = 0;
        kt_uint32_t * p_rows = nullptr;
        va_list       ap;
        va_start(ap, p_criteria);
        require(rg_get_selected_rows_v_1(table_, p_criteria, ap, 0, &total, &p_rows) == 0, "list");
        va_end(ap);
        benchmark::DoNotOptimize(p_rows);
        std::free(p_rows);
        return total;
    }

    void add(row_t row)
    {
        kt_value_t    values[columns]{};
        kt_value_t *  pointers[columns];
        kt_char_ptr_t names[columns];
        for (int i = 0; i < columns; ++i) {
            pointers[i] = &values[i];
            names[i]    = Names[i];
        }
        values[0].val_uint32  = row.id;
        values[1].val_int64   = row.count;
        values[2].val_float64 = row.ratio;
        values[3].ptr_char    = row.name;
        values[4].val_int32   = row.kind;
        require(rg_add_row_1(table_, names, pointers, columns) == 0, "add");
    }

    rg_opaque_handle_t tree_  = nullptr;
    rg_opaque_handle_t table_ = nullptr;
};

// ---- SQLite, in memory ----

class sqlite
{
  public:
    explicit sqlite(unsigned rows)
    {
        require(sqlite3_open(":memory:", &db_) == SQLITE_OK, "sqlite open");
        run("create table t(id integer primary key, count integer, ratio real, name text, kind integer)");
        run("begin");
        sqlite3_stmt * p = prepare("insert into t values(?,?,?,?,?)");
        for (unsigned i = 0; i < rows; ++i) {
            const row_t row(i);
            sqlite3_bind_int64(p, 1, row.id);
            sqlite3_bind_int64(p, 2, row.count);
            sqlite3_bind_double(p, 3, row.ratio);
            sqlite3_bind_text(p, 4, row.name, -1, SQLITE_TRANSIENT);
            sqlite3_bind_int(p, 5, row.kind);
            require(sqlite3_step(p) == SQLITE_DONE, "sqlite insert");
            sqlite3_reset(p);
        }
        sqlite3_finalize(p);
        run("commit");
        // As this library's "like" does, and so that an index range of the name isn't what is compared.
        run("pragma case_sensitive_like = on");
    }
    ~sqlite() { sqlite3_close(db_); }
    sqlite(const sqlite &)             = delete;
    sqlite & operator=(const sqlite &) = delete;

    unsigned list(const std::string & criteria)
    {
        sqlite3_stmt *   p = prepare("select id from t where " + criteria);
        std::vector<int> found;
        while (sqlite3_step(p) == SQLITE_ROW)
            found.push_back(sqlite3_column_int(p, 0));
        sqlite3_finalize(p);
        benchmark::DoNotOptimize(found.data());
        return static_cast<unsigned>(found.size());
    }

    unsigned copy(const std::string & criteria)
    {
        run("create temp table r as select * from t where " + criteria);
        const auto rows = static_cast<unsigned>(sqlite3_changes(db_));
        run("drop table r");
        return rows;
    }

  private:
    void run(const std::string & sql)
    {
        require(sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK, sql.c_str());
    }

    sqlite3_stmt * prepare(const std::string & sql)
    {
        sqlite3_stmt * p = nullptr;
        require(sqlite3_prepare_v2(db_, sql.c_str(), -1, &p, nullptr) == SQLITE_OK, sql.c_str());
        return p;
    }

    sqlite3 * db_ = nullptr;
};

// One store of each kind and size, made when first needed.
template <class Store> Store & store_of(unsigned rows)
{
    static std::map<unsigned, std::unique_ptr<Store>> stores;
    auto &                                            store = stores[rows];
    if (!store)
        store = std::make_unique<Store>(rows);
    return *store;
}

// ---- Workloads ----

std::string matching(int percent)
{
    return "count < " + std::to_string(percent * 10);
}

void report_rows(benchmark::State & state)
{
    state.SetItemsProcessed(state.iterations() * state.range(0));
}

template <class Store> void list_rows(benchmark::State & state)
{
    Store &           store    = store_of<Store>(static_cast<unsigned>(state.range(0)));
    const std::string criteria = matching(static_cast<int>(state.range(1)));
    for (auto _ : state)
        require(store.list(criteria) == state.range(0) * state.range(1) / 100, "rows listed");
    report_rows(state);
}

template <class Store> void copy_rows(benchmark::State & state)
{
    Store &           store    = store_of<Store>(static_cast<unsigned>(state.range(0)));
    const std::string criteria = matching(static_cast<int>(state.range(1)));
    for (auto _ : state) {
        const unsigned copied = store.copy(criteria);
        // SQLite doesn't tell how many rows a "create table as" made.
        require(std::is_same_v<Store, sqlite> || copied == state.range(0) * state.range(1) / 100, "rows copied");
    }
    report_rows(state);
}

// A quarter of the rows matches: half of the counts, and of those half of the names; and all ratios but the highest.
template <class Store> void three_conditions(benchmark::State & state)
{
    Store & store = store_of<Store>(static_cast<unsigned>(state.range(0)));
    for (auto _ : state)
        benchmark::DoNotOptimize(store.list(std::is_same_v<Store, sqlite>
                                                ? "count > 499 and name like 'ab%' and ratio < 0.99"
                                                : "count > 499 && name like \"ab%\" && ratio < 0.99"));
    report_rows(state);
}

// Deletes every row by criteria and commits.
void delete_all(benchmark::State & state)
{
    for (auto _ : state) {
        state.PauseTiming();
        auto store = std::make_unique<registry>(static_cast<unsigned>(state.range(0)));
        char criteria[]{"count >= 0"};
        state.ResumeTiming();
        require(rg_delete_rows_1(store->table(), criteria) == 0, "delete");
        store->commit();
        state.PauseTiming();
        store.reset();
        state.ResumeTiming();
    }
    report_rows(state);
}

void sizes_and_percentages(benchmark::internal::Benchmark * p_benchmark)
{
    for (const int rows : {10'000, 1'000'000})
        for (const int percent : {1, 50})
            p_benchmark->Args({rows, percent});
    p_benchmark->Unit(benchmark::kMillisecond);
}

void sizes(benchmark::internal::Benchmark * p_benchmark)
{
    p_benchmark->Arg(10'000)->Arg(1'000'000)->Unit(benchmark::kMillisecond);
}

BENCHMARK(list_rows<registry>)->Apply(sizes_and_percentages);
BENCHMARK(list_rows<sqlite>)->Apply(sizes_and_percentages);
BENCHMARK(copy_rows<registry>)->Apply(sizes_and_percentages);
BENCHMARK(copy_rows<sqlite>)->Apply(sizes_and_percentages);
BENCHMARK(three_conditions<registry>)->Apply(sizes);
BENCHMARK(three_conditions<sqlite>)->Apply(sizes);
BENCHMARK(delete_all)->Arg(10'000)->Arg(100'000)->Arg(1'000'000)->Unit(benchmark::kMillisecond);

} // namespace

BENCHMARK_MAIN();
