// SPDX-License-Identifier: MIT
// The record pool: block sizes and counts, first fit, splitting and joining, what is zero, and copies.
#include "rg_i_record_buffer_pool.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <numeric>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "support/faults.h"
#include "support/registry.h"

using kt_test::call;
using kt_test::error_code;
using kt_test::error_message_index;
using kt_test::error_text;
using kt_test::fail_call;
using kt_test::fault_scope;

namespace
{

// mt19937 answers with 64 bits of which 32 count.
struct random_numbers {
    using result_type = kt_uint32_t;
    explicit random_numbers(unsigned seed) : engine(seed) {}
    result_type                  operator()() { return static_cast<result_type>(engine()); }
    static constexpr result_type min() { return 0; }
    static constexpr result_type max() { return UINT32_MAX; }
    std::mt19937                 engine;
};

// A pool with the calls in one line each; every failure of a call that shouldn't fail fails the test.
struct test_pool : rg_i_record_buffer_pool_t {
    struct lent_t {
        kt_char_ptr_t p_data     = nullptr;
        kt_char_ptr_t p_previous = nullptr;
        kt_uint32_t   length     = 0;
    };

    test_pool() : rg_i_record_buffer_pool_t{} {}
    ~test_pool() { EXPECT_EQ(rg_i_rb_uninitialize_record_buffer_pool(this), 0); }
    test_pool(const test_pool &)             = delete;
    test_pool & operator=(const test_pool &) = delete;

    lent_t find(kt_uint32_t length)
    {
        lent_t lent;
        EXPECT_EQ(rg_i_rb_find_suitable_record(this, length, &lent.p_data, &lent.p_previous, &lent.length), 0);
        return lent;
    }
    lent_t lend(kt_uint32_t length)
    {
        lent_t lent;
        EXPECT_EQ(rg_i_rb_lend_record(this, length, &lent.p_data, &lent.p_previous, &lent.length), 0);
        return lent;
    }
    kt_char_ptr_t allocate(const lent_t & lent, kt_uint32_t length, kt_uint32_t type = RG_RECORD_TYPE_ROW)
    {
        EXPECT_EQ(rg_i_rb_allocate_record(this, lent.p_data, lent.p_previous, length, type), 0);
        return lent.p_data;
    }
    kt_char_ptr_t take(const lent_t & lent, kt_uint32_t length, kt_uint32_t type = RG_RECORD_TYPE_ROW)
    {
        EXPECT_EQ(rg_i_rb_take_record(this, lent.p_data, lent.p_previous, length, type), 0);
        return lent.p_data;
    }
    kt_char_ptr_t allocate(kt_uint32_t length) { return allocate(find(length), length); }
    void          free(kt_char_ptr_t p_data) { EXPECT_EQ(rg_i_rb_free_record(this, p_data), 0); }
};

using chain_t = std::vector<std::pair<const char *, kt_uint32_t>>; // heads and lengths

chain_t chain_of(const rg_i_record_buffer_pool_t & pool)
{
    chain_t chain;
    for (kt_char_ptr_t p = pool.p_free_chain; p != nullptr;) {
        const auto * const p_head = reinterpret_cast<const rg_i_record_metadata_t *>(p);
        EXPECT_EQ(+p_head->type, RG_RECORD_TYPE_FREE);
        chain.emplace_back(p, +p_head->record_length);
        p = p_head->p_next;
    }
    return chain;
}

std::vector<rg_i_record_buffer_t *> blocks_of(const rg_i_record_buffer_pool_t & pool)
{
    std::vector<rg_i_record_buffer_t *> blocks;
    for (rg_i_record_buffer_t * p = pool.p_first_record_buffer; p != nullptr; p = p->p_next)
        blocks.push_back(p);
    return blocks;
}

char * head(kt_char_ptr_t p_data)
{
    return p_data - RG_I_RECORD_HEAD_LENGTH;
}

kt_uint32_t record_length(kt_char_ptr_t p_data)
{
    return rg_i_record_head(p_data)->record_length;
}

bool all_zero(const char * p, std::size_t length)
{
    return length == 0 || (p[0] == 0 && std::memcmp(p, p + 1, length - 1) == 0);
}

// What the counts must be by the records themselves: each block is walked from record to record.
kt_uint32_t used_bytes_by_records(const rg_i_record_buffer_pool_t & pool)
{
    kt_uint32_t used = 0;
    for (rg_i_record_buffer_t * p_block : blocks_of(pool)) {
        used += RG_I_RECORD_BUFFER_HEAD_LENGTH;
        kt_uint32_t offset = RG_I_RECORD_BUFFER_HEAD_LENGTH;
        while (offset < p_block->total_bytes) {
            const auto * const p_head =
                reinterpret_cast<const rg_i_record_metadata_t *>(reinterpret_cast<const char *>(p_block) + offset);
            used += p_head->type == RG_RECORD_TYPE_FREE ? RG_I_RECORD_HEAD_LENGTH : p_head->record_length;
            offset += p_head->record_length;
        }
        EXPECT_EQ(offset, p_block->total_bytes) << "the records tile the block";
    }
    return used;
}

kt_uint32_t page_size()
{
    return static_cast<kt_uint32_t>(sysconf(_SC_PAGESIZE));
}

} // namespace

// ---- Blocks ----

TEST(making_pools, no_pages_make_a_pool_without_a_block)
{
    rg_i_record_buffer_pool_t pool;
    std::memset(&pool, 0xAA, sizeof pool);
    ASSERT_EQ(rg_i_rb_initialize_record_buffer_pool(0, &pool), 0);
    const rg_i_record_buffer_pool_t empty{};
    EXPECT_EQ(std::memcmp(&pool, &empty, sizeof pool), 0);
    EXPECT_EQ(rg_i_rb_uninitialize_record_buffer_pool(&pool), 0);
}

TEST(making_pools, pages_make_one_block_of_one_free_record)
{
    test_pool pool;
    ASSERT_EQ(rg_i_rb_initialize_record_buffer_pool(3, &pool), 0);
    EXPECT_EQ(pool.total_bytes, 3 * page_size());
    EXPECT_EQ(pool.used_bytes, 32u);
    ASSERT_EQ(blocks_of(pool).size(), 1u);
    EXPECT_EQ(pool.p_first_record_buffer, pool.p_last_record_buffer);
    const char * const p_first = reinterpret_cast<char *>(pool.p_first_record_buffer) + 12;
    EXPECT_EQ(chain_of(pool), (chain_t{{p_first, 3 * page_size() - 12}}));
}

TEST(making_pools, pages_without_memory_give_12_and_an_empty_pool)
{
    fault_scope               faults;
    rg_i_record_buffer_pool_t pool;
    std::memset(&pool, 0xAA, sizeof pool);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_rb_initialize_record_buffer_pool(1, &pool), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(error_message_index(), 3);
    EXPECT_EQ(pool.p_first_record_buffer, nullptr);
    EXPECT_EQ(pool.total_bytes, 0u);
    EXPECT_EQ(rg_i_rb_uninitialize_record_buffer_pool(&pool), 0);
}

TEST(making_pools, more_pages_than_32_bits_of_bytes_give_12)
{
    rg_i_record_buffer_pool_t pool;
    EXPECT_EQ(rg_i_rb_initialize_record_buffer_pool(UINT32_MAX / page_size() + 1, &pool), RG_E_NO_MEMORY);
    EXPECT_EQ(pool.p_first_record_buffer, nullptr);
    EXPECT_EQ(pool.p_free_index, nullptr);
}

TEST(making_pools, uninitializing_leaves_zeros_and_may_be_done_twice)
{
    rg_i_record_buffer_pool_t pool{};
    kt_char_ptr_t             p_data = nullptr;
    for (kt_uint32_t i = 0; i < 300; ++i)
        ASSERT_EQ(rg_i_reserve_record(&pool, 40, RG_RECORD_TYPE_ROW, &p_data), 0);
    EXPECT_EQ(rg_i_rb_uninitialize_record_buffer_pool(&pool), 0);
    const rg_i_record_buffer_pool_t empty{};
    EXPECT_EQ(std::memcmp(&pool, &empty, sizeof pool), 0);
    EXPECT_EQ(rg_i_rb_uninitialize_record_buffer_pool(&pool), 0);
}

TEST(finding_room, a_first_request_of_100_bytes_makes_a_block_of_10032)
{
    test_pool  pool;
    const auto lent = pool.find(100);
    EXPECT_EQ(pool.total_bytes, 10032u);
    EXPECT_EQ(pool.used_bytes, 32u);
    EXPECT_EQ(lent.length, 10000u);
    EXPECT_EQ(lent.p_previous, nullptr);
    ASSERT_EQ(blocks_of(pool).size(), 1u);
    EXPECT_EQ(pool.p_first_record_buffer->total_bytes, 10032u);
    EXPECT_EQ(lent.p_data, reinterpret_cast<char *>(pool.p_first_record_buffer) + 32);
    pool.allocate(lent, 100);
    EXPECT_EQ(pool.used_bytes, 32u + 120u);
    EXPECT_EQ(pool.total_bytes, 10032u);
}

TEST(finding_room, small_requests_buy_a_hundredfold_and_requests_of_64_kib_themselves)
{
    {
        test_pool pool;
        EXPECT_EQ(pool.find(65535).length, 6553500u);
        EXPECT_EQ(pool.total_bytes, 6553532u);
    }
    {
        test_pool pool;
        EXPECT_EQ(pool.find(65536).length, 65536u);
        EXPECT_EQ(pool.total_bytes, 65568u);
    }
}

TEST(finding_room, a_request_of_no_bytes_makes_a_block_of_two_heads)
{
    test_pool  pool;
    const auto lent = pool.find(0);
    EXPECT_EQ(pool.total_bytes, 32u);
    EXPECT_EQ(lent.length, 0u);
    pool.allocate(lent, 0);
    EXPECT_EQ(pool.p_free_chain, nullptr);
    EXPECT_EQ(pool.used_bytes, 32u);
    pool.free(lent.p_data);
    EXPECT_EQ(pool.used_bytes, 32u);
    EXPECT_EQ(pool.find(0).p_data, lent.p_data);
}

TEST(finding_room, a_request_whose_block_would_pass_32_bits_gives_12_and_changes_nothing)
{
    test_pool pool;
    pool.allocate(10);
    const auto        chain = chain_of(pool);
    const kt_uint32_t total = pool.total_bytes;
    for (const kt_uint32_t length : {UINT32_MAX, UINT32_MAX - 19, UINT32_MAX - 20, UINT32_MAX - 31}) {
        kt_char_ptr_t p_data     = nullptr;
        kt_char_ptr_t p_previous = nullptr;
        kt_uint32_t   actual     = 7;
        EXPECT_EQ(rg_i_rb_find_suitable_record(&pool, length, &p_data, &p_previous, &actual), RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(rg_i_rb_lend_record(&pool, length, &p_data, &p_previous, &actual), RG_E_NO_MEMORY);
        EXPECT_EQ(rg_i_reserve_record(&pool, length, RG_RECORD_TYPE_ROW, &p_data), RG_E_NO_MEMORY);
        EXPECT_EQ(actual, 7u);
    }
    EXPECT_EQ(chain_of(pool), chain);
    EXPECT_EQ(pool.total_bytes, total);
}

TEST(finding_room, a_block_that_would_carry_the_total_past_32_bits_gives_12_and_changes_nothing)
{
    test_pool pool;
    pool.allocate(10);
    const auto        chain  = chain_of(pool);
    const kt_uint32_t total  = pool.total_bytes;
    kt_char_ptr_t     p_data = nullptr;
    fault_scope       faults;
    // One byte more than what is left, so no memory is asked for.
    EXPECT_EQ(rg_i_reserve_record(&pool, UINT32_MAX - total - 32 + 1, RG_RECORD_TYPE_ROW, &p_data), RG_E_NO_MEMORY);
    EXPECT_EQ(kt_test::calls_made(call::allocation), 0u);
    EXPECT_EQ(chain_of(pool), chain);
    EXPECT_EQ(pool.total_bytes, total);
    EXPECT_EQ(pool.p_first_record_buffer, pool.p_last_record_buffer);
}

TEST(finding_room, a_block_without_memory_gives_12_and_changes_nothing)
{
    fault_scope   faults;
    test_pool     pool;
    kt_char_ptr_t p_data     = nullptr;
    kt_char_ptr_t p_previous = nullptr;
    kt_uint32_t   actual     = 0;

    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_rb_find_suitable_record(&pool, 100, &p_data, &p_previous, &actual), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(error_message_index(), 3);
    EXPECT_NE(error_text().find("rg_i_rb_find_suitable_record"), std::string::npos);
    const rg_i_record_buffer_pool_t empty{};
    EXPECT_EQ(std::memcmp(static_cast<rg_i_record_buffer_pool_t *>(&pool), &empty, sizeof empty), 0);

    pool.allocate(100);
    const auto        chain = chain_of(pool);
    const kt_uint32_t used  = pool.used_bytes;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_rb_find_suitable_record(&pool, 20000, &p_data, &p_previous, &actual), RG_E_NO_MEMORY);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_rb_lend_record(&pool, 20000, &p_data, &p_previous, &actual), RG_E_NO_MEMORY);
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_reserve_record(&pool, 20000, RG_RECORD_TYPE_ROW, &p_data), RG_E_NO_MEMORY);
    EXPECT_EQ(chain_of(pool), chain);
    EXPECT_EQ(pool.used_bytes, used);
    EXPECT_EQ(pool.total_bytes, 10032u);
    EXPECT_EQ(pool.find(5000).length, 9880u);
}

TEST(finding_room, any_of_many_blocks_without_memory_gives_12_and_the_next_attempt_succeeds)
{
    fault_scope faults;
    test_pool   pool;
    for (kt_uint32_t blocks = 0; blocks < 40; ++blocks) {
        const auto        chain  = chain_of(pool);
        const kt_uint32_t total  = pool.total_bytes;
        const kt_uint32_t used   = pool.used_bytes;
        kt_char_ptr_t     p_data = nullptr;
        for (unsigned nth = 1;; ++nth) {
            fail_call(call::allocation, nth, ENOMEM);
            const kt_int32_t rc = rg_i_reserve_record(&pool, 65536 + blocks * 100, RG_RECORD_TYPE_ROW, &p_data);
            if (rc == 0)
                break;
            ASSERT_EQ(rc, RG_E_NO_MEMORY);
            ASSERT_EQ(chain_of(pool), chain);
            ASSERT_EQ(pool.total_bytes, total);
            ASSERT_EQ(pool.used_bytes, used);
            ASSERT_EQ(blocks_of(pool).size(), blocks);
        }
        kt_test::reset_calls();
        ASSERT_EQ(blocks_of(pool).size(), blocks + 1);
        if (blocks % 2 == 0)
            pool.free(p_data);
    }
    EXPECT_EQ(used_bytes_by_records(pool), pool.used_bytes);
}

TEST(finding_room, the_first_record_in_address_order_that_is_long_enough_is_lent)
{
    test_pool                  pool;
    std::vector<kt_char_ptr_t> records;
    for (const kt_uint32_t length : {100, 30, 60, 30, 80, 30})
        records.push_back(pool.allocate(length));
    pool.free(records[4]); // 80
    pool.free(records[0]); // 100
    pool.free(records[2]); // 60

    EXPECT_EQ(pool.find(101).p_previous, head(records[4]));
    auto lent = pool.find(60);
    EXPECT_EQ(lent.p_data, records[0]);
    EXPECT_EQ(lent.p_previous, nullptr);
    EXPECT_EQ(lent.length, 100u);
    pool.allocate(lent, 100);
    lent = pool.find(61);
    EXPECT_EQ(lent.p_data, records[4]);
    EXPECT_EQ(lent.p_previous, head(records[2])) << "the previous record is given by its head, like the chain";
    lent = pool.find(60);
    EXPECT_EQ(lent.p_data, records[2]);
    EXPECT_EQ(lent.p_previous, nullptr);
}

TEST(finding_room, nothing_allocated_leaves_the_pool_as_it_was_but_for_the_zeros)
{
    test_pool  pool;
    const auto p_data = pool.allocate(200);
    pool.allocate(10);
    std::memset(p_data, 0x55, 200);
    pool.free(p_data);
    const auto        chain = chain_of(pool);
    const kt_uint32_t used  = pool.used_bytes;

    const auto lent = pool.find(150);
    EXPECT_EQ(lent.p_data, p_data);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
    EXPECT_EQ(chain_of(pool), chain);
    EXPECT_EQ(pool.used_bytes, used);
    EXPECT_EQ(pool.find(150).p_data, p_data);
}

// ---- Taking ----

TEST(taking_room, all_of_it_leaves_no_remainder_and_unlinks_the_record)
{
    test_pool  pool;
    const auto lent = pool.find(100);
    pool.allocate(lent, lent.length, RG_RECORD_TYPE_METADATA);
    EXPECT_EQ(pool.p_free_chain, nullptr);
    EXPECT_EQ(pool.used_bytes, pool.total_bytes);
    EXPECT_EQ(+rg_i_record_head(lent.p_data)->type, RG_RECORD_TYPE_METADATA);
    EXPECT_EQ(record_length(lent.p_data), 10020u);
}

TEST(taking_room, a_remainder_of_21_bytes_stays_with_the_record)
{
    test_pool  pool;
    const auto lent = pool.find(100);
    pool.allocate(lent, lent.length - 21);
    EXPECT_EQ(pool.p_free_chain, nullptr);
    EXPECT_EQ(record_length(lent.p_data), 10020u);
    EXPECT_EQ(pool.used_bytes, 10032u);
}

TEST(taking_room, a_remainder_of_22_bytes_becomes_a_free_record)
{
    test_pool  pool;
    const auto lent = pool.find(100);
    pool.allocate(lent, lent.length - 22);
    EXPECT_EQ(chain_of(pool), (chain_t{{lent.p_data + 9978, 22}}));
    EXPECT_EQ(record_length(lent.p_data), 9998u);
    EXPECT_EQ(pool.used_bytes, 32u + 9998u);
    EXPECT_EQ(pool.find(2).p_data, lent.p_data + 9998);
    EXPECT_EQ(pool.total_bytes, 10032u);
}

TEST(taking_room, more_than_was_lent_gives_15_and_changes_nothing)
{
    test_pool  pool;
    const auto lent  = pool.find(100);
    const auto chain = chain_of(pool);
    EXPECT_EQ(rg_i_rb_allocate_record(&pool, lent.p_data, lent.p_previous, lent.length + 1, RG_RECORD_TYPE_ROW),
              RG_E_INTERNAL);
    EXPECT_EQ(error_code(), RG_E_INTERNAL);
    EXPECT_EQ(error_message_index(), 6);
    EXPECT_NE(error_text().find("rg_i_rb_allocate_record"), std::string::npos);
    EXPECT_EQ(rg_i_rb_allocate_record(&pool, lent.p_data, lent.p_previous, UINT32_MAX, RG_RECORD_TYPE_ROW),
              RG_E_INTERNAL);
    EXPECT_EQ(rg_i_rb_take_record(&pool, lent.p_data, lent.p_previous, lent.length + 1, RG_RECORD_TYPE_ROW),
              RG_E_INTERNAL);
    EXPECT_EQ(chain_of(pool), chain);
    EXPECT_EQ(pool.used_bytes, 32u);
    EXPECT_EQ(+rg_i_record_head(lent.p_data)->type, RG_RECORD_TYPE_FREE);
}

TEST(taking_room, a_record_between_others_keeps_the_chain_around_it)
{
    test_pool                  pool;
    std::vector<kt_char_ptr_t> records;
    for (int i = 0; i < 5; ++i)
        records.push_back(pool.allocate(40));
    pool.free(records[0]);
    pool.free(records[2]);
    const auto lent = pool.find(41);
    EXPECT_EQ(lent.p_previous, head(records[2]));
    const auto p_big = pool.allocate(lent, 100);
    EXPECT_EQ(chain_of(pool),
              (chain_t{{head(records[0]), 60}, {head(records[2]), 60}, {p_big + 100, 4020 - 300 - 120}}));
    // The middle one goes whole, though 10 bytes of it aren't asked for.
    pool.allocate(pool.find(40), 40);
    pool.allocate(pool.find(30), 30);
    EXPECT_EQ(record_length(records[2]), 60u);
    EXPECT_EQ(chain_of(pool), (chain_t{{p_big + 100, 4020 - 300 - 120}}));
    EXPECT_EQ(pool.used_bytes, used_bytes_by_records(pool));
}

// ---- Freeing ----

TEST(freeing_records, three_neighbours_in_any_order_become_one_free_record)
{
    std::array<int, 3> order{0, 1, 2};
    do {
        test_pool                    pool;
        const auto                   p_front = pool.allocate(50);
        const auto                   used    = pool.used_bytes;
        const auto                   chain   = chain_of(pool);
        std::array<kt_char_ptr_t, 3> records{};
        for (auto & p : records)
            p = pool.allocate(70);
        for (const int i : order)
            pool.free(records[static_cast<std::size_t>(i)]);
        EXPECT_EQ(chain_of(pool), chain);
        EXPECT_EQ(pool.used_bytes, used);
        pool.free(p_front);
        EXPECT_EQ(pool.used_bytes, 32u);
        EXPECT_EQ(chain_of(pool).size(), 1u);
    } while (std::next_permutation(order.begin(), order.end()));
}

TEST(freeing_records, everything_freed_leaves_32_used_bytes_a_block)
{
    test_pool                  pool;
    std::vector<kt_char_ptr_t> records;
    random_numbers             random(1);
    for (int i = 0; i < 2000; ++i)
        records.push_back(pool.allocate(random() % 500));
    std::shuffle(records.begin(), records.end(), random);
    for (const kt_char_ptr_t p : records)
        pool.free(p);
    const auto blocks = blocks_of(pool);
    EXPECT_GT(blocks.size(), 5u);
    EXPECT_EQ(pool.used_bytes, 32 * blocks.size());
    EXPECT_EQ(chain_of(pool).size(), blocks.size()) << "records of different blocks never join";
}

// Two pools in which the same happens, and of which one gathers what is freed.
struct gathering_pool : testing::Test {
    static constexpr std::size_t total_records = 3000;

    // One block each, so that the heap's choice of addresses plays no part in where the first fit is.
    gathering_pool()
    {
        EXPECT_EQ(rg_i_rb_initialize_record_buffer_pool(300, &gathering), 0);
        EXPECT_EQ(rg_i_rb_initialize_record_buffer_pool(300, &at_once), 0);
        random_numbers random(7);
        for (std::size_t i = 0; i < total_records; ++i) {
            const kt_uint32_t length = random() % 300;
            records.push_back(gathering.allocate(length));
            records_of_other.push_back(at_once.allocate(length));
        }
        std::iota(order.begin(), order.end(), 0);
        std::shuffle(order.begin(), order.end(), random);
    }
    void free_both(std::size_t i)
    {
        gathering.free(records[i]);
        at_once.free(records_of_other[i]);
    }
    // The free records in the order of the chain, by their offsets, so that both pools compare.
    static auto places_in(const test_pool & pool)
    {
        EXPECT_EQ(blocks_of(pool).size(), 1u);
        const auto * const p_block = reinterpret_cast<const char *>(pool.p_first_record_buffer);
        std::vector<std::pair<std::ptrdiff_t, kt_uint32_t>> places;
        for (const auto & [p_record, length] : chain_of(pool))
            places.emplace_back(p_record - p_block, length);
        return places;
    }
    void expect_same()
    {
        const auto places = places_in(gathering);
        EXPECT_TRUE(std::is_sorted(places.begin(), places.end()));
        EXPECT_EQ(places, places_in(at_once));
        EXPECT_EQ(gathering.used_bytes, at_once.used_bytes);
        EXPECT_EQ(gathering.used_bytes, used_bytes_by_records(gathering));
    }

    test_pool                  gathering;
    test_pool                  at_once;
    std::vector<kt_char_ptr_t> records;
    std::vector<kt_char_ptr_t> records_of_other;
    std::vector<std::size_t>   order = std::vector<std::size_t>(total_records);
};

TEST_F(gathering_pool, frees_what_it_gathered_with_the_same_outcome)
{
    const auto        before = chain_of(gathering);
    const kt_uint32_t used   = gathering.used_bytes;
    rg_i_rb_gather_frees(&gathering, total_records);
    for (std::size_t i = 0; i < 2000; ++i)
        free_both(order[i]);
    EXPECT_EQ(chain_of(gathering), before) << "nothing goes before the end";
    EXPECT_EQ(gathering.used_bytes, used);
    rg_i_rb_free_gathered(&gathering);
    expect_same();
    for (std::size_t i = 2000; i < total_records; ++i)
        free_both(order[i]); // at once again, in both
    expect_same();
    EXPECT_EQ(gathering.used_bytes, 32 * blocks_of(gathering).size());
}

TEST_F(gathering_pool, frees_at_once_what_is_more_than_was_expected)
{
    rg_i_rb_gather_frees(&gathering, 1000);
    for (std::size_t i = 0; i < 2000; ++i)
        free_both(order[i]);
    rg_i_rb_free_gathered(&gathering);
    expect_same();
}

TEST_F(gathering_pool, frees_at_once_without_memory_and_where_few_are_expected)
{
    fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    rg_i_rb_gather_frees(&gathering, total_records);
    for (std::size_t i = 0; i < 1000; ++i)
        free_both(order[i]);
    expect_same();
    rg_i_rb_free_gathered(&gathering);
    rg_i_rb_gather_frees(&gathering, 10);
    for (std::size_t i = 1000; i < 2000; ++i)
        free_both(order[i]);
    expect_same();
    rg_i_rb_free_gathered(&gathering);
    expect_same();
}

TEST_F(gathering_pool, has_nothing_to_do_where_nothing_was_freed)
{
    rg_i_rb_gather_frees(&gathering, total_records);
    rg_i_rb_free_gathered(&gathering);
    rg_i_rb_free_gathered(&gathering);
    expect_same();
}

TEST(freeing_records, the_data_is_not_cleared_by_it)
{
    test_pool  pool;
    const auto p_data = pool.allocate(100);
    std::memset(p_data, 0x77, 100);
    pool.free(p_data);
    EXPECT_EQ(p_data[50], 0x77);
    EXPECT_EQ(+rg_i_record_head(p_data)->type, RG_RECORD_TYPE_FREE);
}

TEST(freeing_records, pieces_of_a_record_that_was_cut_up_by_its_owner_go_back_one_by_one)
{
    test_pool  pool;
    const auto lent = pool.find(65536);
    pool.allocate(lent, lent.length, RG_RECORD_TYPE_METADATA);
    // As an open does: the block becomes a row of records, and the tail and the dead ones are given back.
    std::vector<kt_char_ptr_t> pieces;
    kt_uint32_t                left = 65556;
    for (kt_char_ptr_t p = lent.p_data; left > 0;) {
        const kt_uint32_t length           = left < 200 ? left : 100;
        rg_i_record_head(p)->record_length = length;
        rg_i_record_head(p)->type          = RG_RECORD_TYPE_ROW;
        pieces.push_back(p);
        p += length;
        left -= length;
    }
    for (std::size_t i = 0; i < pieces.size(); i += 2)
        pool.free(pieces[i]);
    EXPECT_EQ(chain_of(pool).size(), (pieces.size() + 1) / 2);
    EXPECT_EQ(pool.used_bytes, used_bytes_by_records(pool));
    for (std::size_t i = 1; i < pieces.size(); i += 2)
        pool.free(pieces[i]);
    EXPECT_EQ(pool.used_bytes, 32u);
    EXPECT_EQ(pool.find(65536).p_data, lent.p_data);
}

TEST(freeing_records, the_bare_insertion_walks_a_chain_that_no_pool_owns)
{
    alignas(8) std::array<char, 400> block{};
    const auto                       record = [&](std::size_t at, kt_uint32_t length) {
        reinterpret_cast<rg_i_record_metadata_t *>(&block[at])->record_length = length;
        return &block[at];
    };
    kt_char_ptr_t p_chain    = nullptr;
    kt_char_ptr_t p_previous = block.data();
    EXPECT_EQ(rg_i_rb_insert_free_record(record(100, 50), &p_chain, &p_previous), 30u);
    EXPECT_EQ(p_previous, nullptr);
    EXPECT_EQ(p_chain, &block[100]);
    // Behind, without touching.
    EXPECT_EQ(rg_i_rb_insert_free_record(record(200, 40), &p_chain, &p_previous), 20u);
    EXPECT_EQ(p_previous, &block[100]);
    // Ahead, touching: the new head absorbs the old one.
    EXPECT_EQ(rg_i_rb_insert_free_record(record(60, 40), &p_chain, &p_previous), 40u);
    EXPECT_EQ(p_previous, nullptr);
    EXPECT_EQ(p_chain, &block[60]);
    // Between the two, touching both.
    EXPECT_EQ(rg_i_rb_insert_free_record(record(150, 50), &p_chain, &p_previous), 70u);
    EXPECT_EQ(p_previous, &block[60]);
    const auto * const p_head = reinterpret_cast<rg_i_record_metadata_t *>(p_chain);
    EXPECT_EQ(+p_head->record_length, 180u);
    EXPECT_EQ(+p_head->p_next, nullptr);
}

// ---- What is zero ----

TEST(zeroed_room, whatever_was_written_into_a_lent_record_is_zero_at_the_next_find)
{
    test_pool pool;
    auto      lent = pool.find(100);
    std::memset(lent.p_data, 0x11, lent.length); // written all over, nothing taken
    lent = pool.find(100);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
    std::memset(lent.p_data, 0x22, lent.length); // written all over, little taken
    pool.allocate(lent, 100);
    lent = pool.find(100);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
}

TEST(zeroed_room, a_builder_that_writes_what_it_takes_leaves_the_rest_zero)
{
    test_pool pool;
    for (int i = 0; i < 40; ++i) {
        const auto lent = pool.lend(100);
        std::memset(lent.p_data, 0x33, 90);
        pool.take(lent, 90);
        const auto next = pool.lend(100);
        ASSERT_TRUE(all_zero(next.p_data, next.length)) << "nothing was written there so far";
    }
    const auto lent = pool.find(100);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
}

TEST(zeroed_room, a_builder_that_gives_up_says_how_far_it_wrote)
{
    test_pool pool;
    auto      lent = pool.lend(100);
    std::memset(lent.p_data, 0x44, 500);
    rg_i_rb_give_back_record(&pool, lent.p_data, 500);
    lent = pool.find(100);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
    std::memset(lent.p_data, 0x44, lent.length);
    rg_i_rb_give_back_record(&pool, lent.p_data, UINT32_MAX);
    lent = pool.find(100);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
}

TEST(zeroed_room, bytes_kept_beyond_what_is_taken_are_zero)
{
    test_pool  pool;
    const auto p_data = pool.allocate(100);
    pool.allocate(10);
    std::memset(p_data, 0x55, 100);
    pool.free(p_data);
    const auto lent = pool.lend(79);
    ASSERT_EQ(lent.p_data, p_data);
    std::memset(lent.p_data, 0x66, 79);
    pool.take(lent, 79);
    EXPECT_EQ(record_length(p_data), 120u);
    EXPECT_EQ(p_data[78], 0x66);
    EXPECT_TRUE(all_zero(p_data + 79, 21));
}

TEST(zeroed_room, a_reserved_record_is_zero_and_of_its_type)
{
    test_pool pool;
    auto      lent = pool.find(300);
    std::memset(lent.p_data, 0x55, lent.length);
    kt_char_ptr_t p_data = nullptr;
    ASSERT_EQ(rg_i_reserve_record(&pool, 300, RG_RECORD_TYPE_METADATA, &p_data), 0);
    EXPECT_EQ(p_data, lent.p_data);
    EXPECT_TRUE(all_zero(p_data, 300));
    EXPECT_EQ(record_length(p_data), 320u);
    EXPECT_EQ(+rg_i_record_head(p_data)->type, RG_RECORD_TYPE_METADATA);
    EXPECT_EQ(pool.used_bytes, 352u);
    lent = pool.find(1);
    EXPECT_TRUE(all_zero(lent.p_data, lent.length));
}

TEST(zeroed_room, a_few_bytes_behind_the_last_record_of_a_block_can_be_read_and_are_zero)
{
    for (const kt_uint32_t length : {65536u, 65537u, 65541u, 65543u}) {
        test_pool  pool;
        const auto lent = pool.find(length);
        std::memset(lent.p_data, 0x55, lent.length);
        pool.allocate(lent, lent.length);
        EXPECT_TRUE(all_zero(lent.p_data + lent.length, RG_I_RECORD_OVERHANG));
        test_pool                                   copy;
        rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
        ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
        EXPECT_TRUE(all_zero(rg_i_rb_map_duplicated_address(p_map, lent.p_data) + lent.length, RG_I_RECORD_OVERHANG));
        EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
    }
}

// ---- Pools that have grown ----

namespace
{

constexpr kt_uint32_t record_of_1000       = 1000; // blocks of 100,032 bytes
constexpr kt_uint32_t block_of_1000        = 100 * record_of_1000 + 32;
constexpr kt_uint32_t blocks_of_grown_pool = 60;

void grow(test_pool & pool, kt_uint32_t blocks = blocks_of_grown_pool)
{
    while (blocks_of(pool).size() < blocks)
        std::memset(pool.allocate(record_of_1000), 0xFF, record_of_1000);
}

} // namespace

TEST(grown_pools, have_blocks_and_counts_as_small_ones_have)
{
    test_pool pool;
    grow(pool);
    const auto blocks = blocks_of(pool);
    EXPECT_EQ(pool.total_bytes, blocks_of_grown_pool * block_of_1000);
    for (rg_i_record_buffer_t * const p_block : blocks)
        EXPECT_EQ(+p_block->total_bytes, block_of_1000);
    const chain_t chain = chain_of(pool);
    EXPECT_TRUE(std::is_sorted(chain.begin(), chain.end()));
    EXPECT_EQ(pool.used_bytes, used_bytes_by_records(pool));
}

TEST(grown_pools, ask_the_heap_for_several_blocks_at_once)
{
    fault_scope faults;
    test_pool   pool;
    grow(pool);
    const unsigned before = calls_made(call::allocation);
    grow(pool, 2 * blocks_of_grown_pool);
    EXPECT_LT(calls_made(call::allocation) - before, blocks_of_grown_pool / 4);
}

TEST(grown_pools, hand_out_zeros_though_the_heap_does_not)
{
    { // what the heap will hand out again
        test_pool pool;
        grow(pool);
    }
    test_pool pool;
    for (kt_uint32_t i = 0; i < 20'000; ++i) {
        const kt_char_ptr_t p_data = pool.allocate(record_of_1000 / 2 + i % 500);
        ASSERT_TRUE(all_zero(p_data, record_of_1000 / 2));
        std::memset(p_data, 0xFF, record_of_1000 / 2);
    }
    const auto lent = pool.lend(record_of_1000);
    EXPECT_TRUE(all_zero(lent.p_data + lent.length, RG_I_RECORD_OVERHANG));
}

TEST(grown_pools, fall_back_to_single_blocks_where_there_is_no_memory_for_several)
{
    fault_scope faults;
    test_pool   pool;
    grow(pool, 36); // its tree has room for 63
    bool failed = false;
    for (kt_uint32_t more = 1; more <= 25 && !failed; ++more) {
        fail_call(call::allocation, 1, ENOMEM);
        grow(pool, static_cast<kt_uint32_t>(blocks_of(pool).size() + 1));
        failed = kt_test::failed_as_asked(call::allocation);
        kt_test::reset_calls();
    }
    EXPECT_TRUE(failed);
    EXPECT_EQ(pool.used_bytes, used_bytes_by_records(pool));
}

TEST(grown_pools, lend_and_take_back_as_walking_the_chain_does)
{
    test_pool                  pool;
    std::vector<kt_char_ptr_t> records;
    random_numbers             random(3);
    while (blocks_of(pool).size() < blocks_of_grown_pool)
        records.push_back(pool.allocate(record_of_1000 - random() % 200));
    for (int i = 0; i < 3000 && !testing::Test::HasFailure(); ++i) {
        const std::size_t n = random() % records.size();
        pool.free(std::exchange(records[n], records.back()));
        records.pop_back();
        if (random() % 3 == 0)
            continue;
        const kt_uint32_t length = 1 + random() % record_of_1000;
        const chain_t     chain  = chain_of(pool);
        const auto        it =
            std::find_if(chain.begin(), chain.end(), [=](const auto & record) { return record.second - 20 >= length; });
        const auto lent = pool.lend(length);
        ASSERT_NE(it, chain.end());
        EXPECT_EQ(head(lent.p_data), it->first);
        EXPECT_EQ(lent.p_previous, it == chain.begin() ? nullptr : std::prev(it)->first);
        records.push_back(pool.take(lent, length));
    }
    const chain_t chain = chain_of(pool);
    EXPECT_TRUE(std::is_sorted(chain.begin(), chain.end()));
    EXPECT_EQ(pool.used_bytes, used_bytes_by_records(pool));
}

TEST(grown_pools, are_copied_into_one_block)
{
    test_pool pool;
    grow(pool);
    kt_char_ptr_t p_data = pool.allocate(100);
    std::memset(p_data, 'x', 100);
    test_pool                                   copy;
    rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
    ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
    EXPECT_EQ(copy.total_bytes, pool.total_bytes - 12 * (blocks_of_grown_pool - 1));
    EXPECT_EQ(std::memcmp(rg_i_rb_map_duplicated_address(p_map, p_data), p_data, 100), 0);
    EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
    EXPECT_EQ(copy.used_bytes, used_bytes_by_records(copy));
}

TEST(zeroed_room, a_big_block_that_nothing_is_taken_from_costs_no_memory)
{
    const auto resident_bytes = [] {
        long        pages_total = 0, pages_resident = 0;
        std::FILE * p_file = std::fopen("/proc/self/statm", "r");
        EXPECT_NE(p_file, nullptr);
        EXPECT_EQ(std::fscanf(p_file, "%ld %ld", &pages_total, &pages_resident), 2);
        std::fclose(p_file);
        return pages_resident * static_cast<long>(page_size());
    };
    constexpr kt_uint32_t size = 512u << 20;
    test_pool             pool;
    const long            before = resident_bytes();
    const auto            lent   = pool.lend(size);
    EXPECT_EQ(lent.length, size);
    pool.take(lent, 100);
    // A quarter leaves room for what a checking build keeps about memory.
    EXPECT_LT(resident_bytes() - before, static_cast<long>(size / 4));
}

// ---- Against a plain model ----

namespace
{

// What the pool must do, told plainly: lists of free records in address order, walked from the first.
class model
{
  public:
    explicit model(unsigned seed) : random_(seed) {}

    void run(int operations, kt_uint32_t longest, std::size_t most_records, int operations_a_check)
    {
        for (int i = 0; i < operations && !testing::Test::HasFailure(); ++i) {
            const unsigned kind = random_() % 16;
            if (records_.size() >= most_records || (kind < 5 && !records_.empty()))
                free_one();
            else if (kind < 9)
                build(&test_pool::find, true, longest);
            else if (kind < 14)
                build(&test_pool::lend, false, longest);
            else if (kind < 15)
                reserve(longest);
            else
                give_all_back_now_and_then();
            ASSERT_EQ(pool_.used_bytes, used_) << "operation " << i;
            ASSERT_EQ(pool_.total_bytes, total_) << "operation " << i;
            if (i % operations_a_check == 0)
                check_chain();
        }
        check_chain();
        EXPECT_EQ(used_bytes_by_records(pool_), used_);
        for (const kept_t & kept : records_)
            check_content(kept);
    }
    std::size_t blocks() const { return blocks_; }

  private:
    struct kept_t {
        kt_char_ptr_t p_data;
        kt_uint32_t   written;
        char          byte;
    };
    using free_list = std::vector<std::pair<char *, kt_uint32_t>>; // sorted by address

    kt_uint32_t some_length(kt_uint32_t longest)
    {
        if (longest > 1000 && random_() % 2000 == 0)
            return 65530 + random_() % 12;
        return random_() % 8 == 0 ? random_() % 24 : random_() % longest;
    }

    // What a find must answer; a block that was made for it is entered first.
    free_list::iterator expected(kt_uint32_t length, kt_char_ptr_t p_data)
    {
        const auto fits = [&](const auto & record) { return record.second - 20 >= length; };
        auto       it   = std::find_if(free_.begin(), free_.end(), fits);
        if (it != free_.end())
            return it;
        const kt_uint32_t size = length * (length < 65536 ? 100 : 1) + 32;
        total_ += size;
        used_ += 32;
        ++blocks_;
        auto * const p_block = reinterpret_cast<char *>(pool_.p_last_record_buffer);
        EXPECT_EQ(p_block + 32, p_data);
        EXPECT_EQ(pool_.p_last_record_buffer->total_bytes, size);
        return free_.insert(std::lower_bound(free_.begin(), free_.end(), std::pair{p_block + 12, 0u}),
                            {p_block + 12, size - 12});
    }

    void take(free_list::iterator it, kt_uint32_t length)
    {
        const kt_uint32_t remainder = it->second - 20 - length;
        if (remainder < 22) {
            used_ += it->second - 20;
            free_.erase(it);
        } else {
            used_ += length + 20;
            it->first += length + 20;
            it->second = remainder;
        }
    }

    void build(test_pool::lent_t (test_pool::*get)(kt_uint32_t), bool zeroed, kt_uint32_t longest)
    {
        const kt_uint32_t length = some_length(longest);
        const auto        lent   = (pool_.*get)(length);
        const auto        it     = expected(length, lent.p_data);
        ASSERT_EQ(lent.p_data, it->first + 20);
        ASSERT_EQ(lent.p_previous, it == free_.begin() ? nullptr : std::prev(it)->first);
        ASSERT_EQ(lent.length, it->second - 20);
        if (zeroed) {
            ASSERT_TRUE(all_zero(lent.p_data, lent.length));
        }

        const auto byte = static_cast<char>(1 + random_() % 255);
        const auto used = static_cast<kt_uint32_t>(random_() % (std::min(lent.length, length + 30) + 1));
        if (random_() % 4 == 0) { // gives up
            const kt_uint32_t written = zeroed && random_() % 8 == 0 ? lent.length : used;
            std::memset(lent.p_data, byte, written);
            if (!zeroed)
                rg_i_rb_give_back_record(&pool_, lent.p_data, written);
            return;
        }
        if (zeroed) { // may write anywhere, whatever it takes
            std::memset(lent.p_data, byte, std::min(lent.length, used + 200));
            pool_.allocate(lent, used);
        } else {
            std::memset(lent.p_data, byte, used);
            pool_.take(lent, used);
            ASSERT_TRUE(all_zero(lent.p_data + used, rg_i_record_data_length(lent.p_data) - used));
        }
        take(it, used);
        records_.push_back({lent.p_data, used, byte});
    }

    void reserve(kt_uint32_t longest)
    {
        const kt_uint32_t length = some_length(longest);
        kt_char_ptr_t     p_data = nullptr;
        ASSERT_EQ(rg_i_reserve_record(&pool_, length, RG_RECORD_TYPE_ROW, &p_data), 0);
        const auto it = expected(length, p_data);
        ASSERT_EQ(p_data, it->first + 20);
        take(it, length);
        ASSERT_TRUE(all_zero(p_data, rg_i_record_data_length(p_data)));
        std::memset(p_data, 0x5A, length);
        records_.push_back({p_data, length, 0x5A});
    }

    void check_content(const kept_t & kept)
    {
        const bool untouched = kept.written == 0 || (kept.p_data[0] == kept.byte && all_same(kept));
        ASSERT_TRUE(untouched) << "a kept record changed";
    }
    static bool all_same(const kept_t & kept)
    {
        return std::memcmp(kept.p_data, kept.p_data + 1, kept.written - 1) == 0;
    }

    void free_one()
    {
        const std::size_t i    = random_() % records_.size();
        const kept_t      kept = records_[i];
        records_[i]            = records_.back();
        records_.pop_back();
        check_content(kept);

        char *      p_record = head(kept.p_data);
        kt_uint32_t length   = record_length(kept.p_data);
        used_ -= length - 20;
        std::memset(kept.p_data, 0x3C, length - 20); // the owner may have used the spare bytes too
        pool_.free(kept.p_data);

        auto it = std::lower_bound(free_.begin(), free_.end(), std::pair{p_record, 0u});
        if (it != free_.end() && p_record + length == it->first) {
            used_ -= 20;
            length += it->second;
            it = free_.erase(it);
        }
        if (it != free_.begin() && std::prev(it)->first + std::prev(it)->second == p_record) {
            used_ -= 20;
            std::prev(it)->second += length;
        } else {
            free_.insert(it, {p_record, length});
        }
    }

    void give_all_back_now_and_then()
    {
        if (random_() % 500 != 0)
            return;
        while (!records_.empty() && !testing::Test::HasFailure())
            free_one();
        EXPECT_EQ(free_.size(), blocks_);
    }

    void check_chain()
    {
        const chain_t chain = chain_of(pool_);
        ASSERT_EQ(chain.size(), free_.size());
        for (std::size_t i = 0; i < chain.size(); ++i) {
            ASSERT_EQ(chain[i].first, free_[i].first);
            ASSERT_EQ(chain[i].second, free_[i].second);
        }
        ASSERT_EQ(blocks_of(pool_).size(), blocks_);
    }

    random_numbers      random_;
    test_pool           pool_;
    free_list           free_;
    std::vector<kept_t> records_;
    kt_uint32_t         used_   = 0;
    kt_uint32_t         total_  = 0;
    std::size_t         blocks_ = 0;
};

} // namespace

TEST(any_sequence_of_calls, does_what_walking_the_chain_does_with_small_records)
{
    model m(11);
    m.run(120000, 60, 700, 100);
    EXPECT_GT(m.blocks(), 5u);
}

TEST(any_sequence_of_calls, does_what_walking_the_chain_does_with_records_of_all_sizes)
{
    for (unsigned seed = 1; seed <= 4; ++seed) {
        model m(seed);
        m.run(20000, 700, 900, 200);
        EXPECT_GT(m.blocks(), 2u);
    }
}

TEST(any_sequence_of_calls, does_what_walking_the_chain_does_in_many_small_blocks)
{
    model m(21);
    m.run(60000, 4, 5000, 500);
    EXPECT_GT(m.blocks(), 50u);
}

TEST(any_sequence_of_calls, does_what_walking_the_chain_does_in_long_chains)
{
    model m(31);
    m.run(30000, 3000, 3000, 500);
}

// ---- Copies ----

TEST(duplicating_pools, three_blocks_become_one_that_is_24_bytes_smaller)
{
    test_pool                  pool;
    std::vector<kt_char_ptr_t> records;
    for (const kt_uint32_t length : {65536u, 70000u, 80000u}) {
        const auto lent = pool.find(length);
        records.push_back(pool.allocate(lent, length / 2));
        std::memset(records.back(), static_cast<int>(records.size()), length / 2);
        records.push_back(pool.allocate(100 + length / 4));
    }
    pool.free(records[1]);
    ASSERT_EQ(blocks_of(pool).size(), 3u);

    test_pool                                   copy;
    rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
    ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
    EXPECT_EQ(copy.total_bytes, pool.total_bytes - 24);
    EXPECT_EQ(copy.used_bytes, pool.used_bytes - 24);
    ASSERT_EQ(blocks_of(copy).size(), 1u);
    EXPECT_EQ(copy.p_first_record_buffer, copy.p_last_record_buffer);
    EXPECT_EQ(copy.p_first_record_buffer->total_bytes, copy.total_bytes);
    EXPECT_EQ(copy.p_first_record_buffer->p_next, nullptr);
    EXPECT_EQ(used_bytes_by_records(copy), copy.used_bytes);

    EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, nullptr), nullptr);
    char elsewhere = 0;
    EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, &elsewhere), nullptr);
    ASSERT_EQ(p_map->total, 3u);
    const auto blocks = blocks_of(pool);
    for (kt_uint32_t i = 0; i < 3; ++i) {
        EXPECT_EQ(p_map->p_begin[i], reinterpret_cast<char *>(blocks[i]) + 12);
        EXPECT_EQ(p_map->p_end[i], reinterpret_cast<char *>(blocks[i]) + blocks[i]->total_bytes);
        const auto distance =
            reinterpret_cast<std::uintptr_t>(p_map->p_to[i]) - reinterpret_cast<std::uintptr_t>(p_map->p_begin[i]);
        EXPECT_EQ(p_map->p_offset[i], static_cast<kt_int32_t>(static_cast<kt_uint32_t>(distance)));
        EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, p_map->p_begin[i]), p_map->p_to[i]);
        EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, p_map->p_begin[i] - 1), nullptr) << "a block's head";
        EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, p_map->p_end[i] - 1),
                  p_map->p_to[i] + (p_map->p_end[i] - 1 - p_map->p_begin[i]));
    }
    EXPECT_EQ(p_map->p_to[1], p_map->p_to[0] + 65556) << "the records of all blocks end up one behind the other";
    for (const kt_char_ptr_t p : records) {
        const kt_char_ptr_t p_copied = rg_i_rb_map_duplicated_address(p_map, p);
        ASSERT_EQ(record_length(p_copied), record_length(p));
        EXPECT_EQ(std::memcmp(p_copied - 8, p - 8, record_length(p) - 12), 0);
    }
    EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
}

TEST(duplicating_pools, the_copy_goes_on_as_a_pool_in_address_order)
{
    random_numbers random(5);
    for (int round = 0; round < 20; ++round) {
        test_pool                  pool;
        std::vector<kt_char_ptr_t> records;
        for (int i = 0; i < 400; ++i)
            records.push_back(pool.allocate(1 + random() % (round % 2 == 0 ? 40u : 4000u)));
        std::shuffle(records.begin(), records.end(), random);
        for (int i = 0; i < 200; ++i, records.pop_back())
            pool.free(records.back());

        test_pool                                   copy;
        rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
        ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
        chain_t expected;
        for (const auto & [p, length] : chain_of(pool))
            expected.emplace_back(rg_i_rb_map_duplicated_address(p_map, const_cast<char *>(p)), length);
        std::sort(expected.begin(), expected.end());
        EXPECT_EQ(chain_of(copy), expected);

        // The copy's own room: found, zero, taken and freed as in any pool.
        for (const kt_uint32_t length : {0u, 10u, 100u, 1000u, 3000u}) {
            const auto lent = copy.find(length);
            ASSERT_TRUE(all_zero(lent.p_data, lent.length));
            const auto first = std::find_if(expected.begin(), expected.end(),
                                            [&](const auto & record) { return record.second - 20 >= length; });
            if (first != expected.end()) {
                ASSERT_EQ(head(lent.p_data), first->first);
                ASSERT_EQ(lent.p_previous, first == expected.begin() ? nullptr : std::prev(first)->first);
            }
        }
        for (const kt_char_ptr_t p : records)
            copy.free(rg_i_rb_map_duplicated_address(p_map, p));
        const chain_t chain = chain_of(copy);
        EXPECT_TRUE(std::is_sorted(chain.begin(), chain.end()));
        EXPECT_EQ(used_bytes_by_records(copy), copy.used_bytes);
        EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
    }
}

TEST(duplicating_pools, free_records_at_the_seams_are_not_merged)
{
    test_pool pool;
    pool.find(65536);
    pool.find(70000);
    ASSERT_EQ(chain_of(pool).size(), 2u);
    test_pool                                   copy;
    rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
    ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
    const chain_t chain = chain_of(copy);
    ASSERT_EQ(chain.size(), 2u);
    EXPECT_EQ(chain[0].first + chain[0].second, chain[1].first);
    EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
}

TEST(duplicating_pools, a_pool_without_a_block_becomes_a_block_of_12_bytes)
{
    test_pool                                   pool;
    test_pool                                   copy;
    rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
    ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map), 0);
    EXPECT_EQ(copy.total_bytes, 12u);
    EXPECT_EQ(copy.used_bytes, 12u);
    EXPECT_EQ(copy.p_free_chain, nullptr);
    EXPECT_EQ(p_map->total, 0u);
    EXPECT_EQ(rg_i_rb_map_duplicated_address(p_map, nullptr), nullptr);
    EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);

    const auto p_data = copy.allocate(100);
    EXPECT_EQ(copy.total_bytes, 10044u);
    copy.free(p_data);
    EXPECT_EQ(copy.used_bytes, 44u);

    // And the copy, whose first block is empty, can be copied again.
    test_pool again;
    ASSERT_EQ(rg_i_rb_duplicate_record_buffer_pool(&copy, &again, &p_map), 0);
    EXPECT_EQ(again.total_bytes, 10032u);
    EXPECT_EQ(again.used_bytes, 32u);
    EXPECT_EQ(again.find(10000).p_data, rg_i_rb_map_duplicated_address(p_map, p_data));
    EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
}

TEST(duplicating_pools, without_memory_gives_12_and_an_unusable_copy_with_its_counts_set)
{
    fault_scope faults;
    test_pool   pool;
    pool.find(65536);
    pool.allocate(70000);
    const auto        chain = chain_of(pool);
    const kt_uint32_t used  = pool.used_bytes;
    unsigned          nth   = 1;
    for (;; ++nth) {
        test_pool                                   copy;
        rg_i_record_buffer_pool_duplication_map_t * p_map = nullptr;
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc = rg_i_rb_duplicate_record_buffer_pool(&pool, &copy, &p_map);
        fail_call(call::allocation, 1, ENOMEM, 0);
        if (rc == 0) {
            EXPECT_EQ(rg_i_rb_free_duplication_map(p_map), 0);
            break;
        }
        EXPECT_EQ(rc, RG_E_NO_MEMORY);
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(p_map, nullptr);
        EXPECT_EQ(copy.p_first_record_buffer, nullptr);
        EXPECT_EQ(copy.total_bytes, nth == 1 ? 0u : pool.total_bytes - 12);
        EXPECT_EQ(copy.used_bytes, nth == 1 ? 0u : pool.used_bytes - 12);
        EXPECT_EQ(chain_of(pool), chain);
        EXPECT_EQ(pool.used_bytes, used);
    }
    EXPECT_GE(nth, 6u);
}

TEST(duplicating_pools, no_map_at_all_may_be_freed)
{
    EXPECT_EQ(rg_i_rb_free_duplication_map(nullptr), 0);
}
