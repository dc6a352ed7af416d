// SPDX-License-Identifier: MIT
// pool_bench: what the record pool costs as it fills, frees and fragments. The argument is the number of records.
//
// Each figure is per record. lend_and_take is the pool's share of adding a row; free_in_random_order that of a commit
// which replaces records all over; the fragmented ones begin with every other record freed. To compare two builds, run
// both with --benchmark_repetitions=5 and look at the medians.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <vector>

#include "rg_i_read_write_lock.h"
#include "rg_i_record_buffer_pool.h"

namespace
{

constexpr kt_uint32_t row_length = 80;

void must(bool holds, const char * p_what)
{
    if (!holds) {
        std::fprintf(stderr, "pool_bench: %s\n", p_what);
        std::abort();
    }
}

kt_char_ptr_t add(rg_i_record_buffer_pool_t & pool, kt_uint32_t length)
{
    kt_char_ptr_t p_data     = nullptr;
    kt_char_ptr_t p_previous = nullptr;
    kt_uint32_t   lent       = 0;
    must(rg_i_rb_lend_record(&pool, length, &p_data, &p_previous, &lent) == 0, "no room was lent");
    std::memset(p_data, 1, length);
    must(rg_i_rb_take_record(&pool, p_data, p_previous, length, RG_RECORD_TYPE_ROW) == 0, "nothing could be taken");
    return p_data;
}

// 80 bytes each, or anything from 40 to 119.
std::vector<kt_char_ptr_t> filled(rg_i_record_buffer_pool_t & pool, std::size_t count, bool mixed_lengths)
{
    std::mt19937               random(1);
    std::vector<kt_char_ptr_t> records(count);
    for (kt_char_ptr_t & p : records)
        p = add(pool, mixed_lengths ? static_cast<kt_uint32_t>(40 + random() % 80) : row_length);
    return records;
}

void per_record(benchmark::State & state, std::size_t records)
{
    state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(records));
    state.counters["ns/record"] =
        benchmark::Counter(static_cast<double>(records) * 1e-9,
                           benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void lend_and_take(benchmark::State & state, bool mixed_lengths)
{
    const auto count = static_cast<std::size_t>(state.range(0));
    for (auto _ : state) {
        rg_i_record_buffer_pool_t pool{};
        filled(pool, count, mixed_lengths);
        state.PauseTiming();
        rg_i_rb_uninitialize_record_buffer_pool(&pool);
        state.ResumeTiming();
    }
    per_record(state, count);
}

// One block, as an opened file has: the records stand behind each other in it.
std::vector<kt_char_ptr_t> one_block(rg_i_record_buffer_pool_t & pool, std::size_t count)
{
    constexpr kt_uint32_t record_length = row_length + RG_I_RECORD_HEAD_LENGTH;
    const auto            image         = static_cast<kt_uint32_t>(count * record_length);
    kt_char_ptr_t         p_data        = nullptr;
    must(rg_i_reserve_record(&pool, std::max(image, 65536u) - 20, RG_RECORD_TYPE_METADATA, &p_data) == 0, "no block");
    std::vector<kt_char_ptr_t> records(count);
    for (kt_char_ptr_t & p : records) {
        p                    = p_data;
        *rg_i_record_head(p) = {record_length, nullptr, RG_RECORD_TYPE_ROW, 0};
        p_data += record_length;
    }
    return records;
}

void free_in_random_order(benchmark::State & state, bool in_one_block)
{
    const auto count = static_cast<std::size_t>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        rg_i_record_buffer_pool_t pool{};
        auto                      records = in_one_block ? one_block(pool, count) : filled(pool, count, true);
        std::shuffle(records.begin(), records.end(), std::mt19937(2));
        state.ResumeTiming();
        for (const kt_char_ptr_t p : records)
            rg_i_rb_free_record(&pool, p);
        state.PauseTiming();
        rg_i_rb_uninitialize_record_buffer_pool(&pool);
        state.ResumeTiming();
    }
    per_record(state, count);
}

// Every other record is free, in random order of freeing; then as many are built again.
void fill_fragmented(benchmark::State & state, bool in_one_block)
{
    const auto count = static_cast<std::size_t>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        rg_i_record_buffer_pool_t  pool{};
        const auto                 records = in_one_block ? one_block(pool, count) : filled(pool, count, true);
        std::vector<kt_char_ptr_t> others;
        for (std::size_t i = 0; i < count; i += 2)
            others.push_back(records[i]);
        std::shuffle(others.begin(), others.end(), std::mt19937(3));
        for (const kt_char_ptr_t p : others)
            rg_i_rb_free_record(&pool, p);
        std::mt19937 random(4);
        state.ResumeTiming();
        for (std::size_t i = 0; i < count / 2; ++i)
            add(pool, static_cast<kt_uint32_t>(30 + random() % 70));
        state.PauseTiming();
        rg_i_rb_uninitialize_record_buffer_pool(&pool);
        state.ResumeTiming();
    }
    per_record(state, count / 2);
}

// Searches that the first free record serves and ones that only the last does, in turn.
void find_after_fragmentation(benchmark::State & state)
{
    const auto                count = static_cast<std::size_t>(state.range(0));
    rg_i_record_buffer_pool_t pool{};
    const auto                records = one_block(pool, count);
    for (std::size_t i = 0; i < count; i += 2)
        rg_i_rb_free_record(&pool, records[i]);
    rg_i_rb_free_record(&pool, records[count - 1]); // with the one before it: the only one that is long enough
    kt_uint32_t length = 0;
    for (auto _ : state) {
        kt_char_ptr_t p_data     = nullptr;
        kt_char_ptr_t p_previous = nullptr;
        kt_uint32_t   lent       = 0;
        length                   = length == row_length ? row_length + 1 : row_length;
        must(rg_i_rb_lend_record(&pool, length, &p_data, &p_previous, &lent) == 0, "no room was lent");
        benchmark::DoNotOptimize(p_data);
    }
    rg_i_rb_uninitialize_record_buffer_pool(&pool);
}

// One record replaced again and again: the new one is built, then the old one freed.
void replace_records(benchmark::State & state)
{
    const auto                count = static_cast<std::size_t>(state.range(0));
    rg_i_record_buffer_pool_t pool{};
    auto                      records = filled(pool, count, true);
    std::mt19937              random(5);
    for (auto _ : state) {
        kt_char_ptr_t & p = records[random() % count];
        kt_char_ptr_t   q = add(pool, static_cast<kt_uint32_t>(40 + random() % 80));
        rg_i_rb_free_record(&pool, p);
        p = q;
    }
    rg_i_rb_uninitialize_record_buffer_pool(&pool);
}

void read_lock_pair(benchmark::State & state)
{
    rg_i_read_write_lock_t lock;
    rg_i_rw_open(&lock);
    for (auto _ : state) {
        must(rg_i_rw_lock_read(&lock) == 0, "not locked");
        rg_i_rw_unlock_read(&lock);
    }
    rg_i_rw_close(&lock);
}

void write_lock_pair(benchmark::State & state)
{
    rg_i_read_write_lock_t lock;
    rg_i_rw_open(&lock);
    for (auto _ : state) {
        must(rg_i_rw_lock_write(&lock) == 0, "not locked");
        rg_i_rw_unlock_write(&lock);
    }
    rg_i_rw_close(&lock);
}

constexpr std::int64_t fewest = 1000, most = 1000000;

BENCHMARK_CAPTURE(lend_and_take, equal_lengths, false)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK_CAPTURE(lend_and_take, mixed_lengths, true)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK_CAPTURE(free_in_random_order, many_blocks, false)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK_CAPTURE(free_in_random_order, one_block, true)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK_CAPTURE(fill_fragmented, many_blocks, false)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK_CAPTURE(fill_fragmented, one_block, true)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK(find_after_fragmentation)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK(replace_records)->RangeMultiplier(10)->Range(fewest, most);
BENCHMARK(read_lock_pair);
BENCHMARK(write_lock_pair);

} // namespace

BENCHMARK_MAIN();
