// SPDX-License-Identifier: MIT
// The set of free slots behind a row index: it must answer like a sorted set, for any number of slots.
#include "table/rg_i_free_slot_index.h"

#include <gtest/gtest.h>

#include <random>
#include <set>
#include <vector>

namespace
{

// The set under test beside one that is known to be right.
class checked_set
{
  public:
    checked_set(kt_uint32_t slots, kt_uint32_t first) : slots_(slots), words_(rg_i_free_slot_index_words(slots), ~0ull)
    {
        rg_i_free_slot_index_fill(words_.data(), slots, first);
        for (kt_uint32_t slot = first; slot < slots; ++slot)
            truth_.insert(truth_.end(), slot);
    }
    void toggle(kt_uint32_t slot)
    {
        if (truth_.erase(slot) != 0) {
            rg_i_free_slot_index_remove(words_.data(), slots_, slot);
        } else {
            truth_.insert(slot);
            rg_i_free_slot_index_add(words_.data(), slots_, slot);
        }
    }
    void check(kt_uint32_t slot) const
    {
        ASSERT_EQ(rg_i_free_slot_index_contains(words_.data(), slot), truth_.count(slot) != 0) << slot;
        const auto        next     = truth_.lower_bound(slot);
        const kt_uint32_t expected = next == truth_.begin() ? RG_I_NO_SLOT : *std::prev(next);
        ASSERT_EQ(rg_i_free_slot_index_below(words_.data(), slots_, slot), expected) << slot << " of " << slots_;
    }
    void check_all() const
    {
        for (kt_uint32_t slot = 0; slot < slots_; ++slot)
            ASSERT_NO_FATAL_FAILURE(check(slot));
    }

  private:
    kt_uint32_t              slots_;
    std::vector<kt_uint64_t> words_;
    std::set<kt_uint32_t>    truth_;
};

const kt_uint32_t sizes[] = {1, 2, 10, 63, 64, 65, 100, 127, 128, 200, 4095, 4096, 4097, 10000};

} // namespace

TEST(the_free_slot_index, starts_with_the_slots_from_the_first_one_given)
{
    for (const kt_uint32_t slots : sizes)
        for (const kt_uint32_t first : {0u, 1u, slots / 2, slots - 1, slots})
            ASSERT_NO_FATAL_FAILURE(checked_set(slots, first).check_all()) << slots << " from " << first;
}

TEST(the_free_slot_index, finds_the_nearest_free_slot_below_for_any_number_of_slots)
{
    std::mt19937 random(17);
    for (const kt_uint32_t slots : sizes) {
        checked_set set(slots, slots);
        for (int round = 0; round < 2000; ++round) {
            set.toggle(static_cast<kt_uint32_t>(random() % slots));
            ASSERT_NO_FATAL_FAILURE(set.check(static_cast<kt_uint32_t>(random() % slots)));
        }
    }
}

TEST(the_free_slot_index, finds_a_neighbour_across_levels_that_are_empty_in_between)
{
    const kt_uint32_t slots = 300000; // four levels
    checked_set       set(slots, slots);
    set.toggle(0);
    set.check(slots - 1);
    set.toggle(262143);
    set.check(262143);
    set.check(262144);
    set.check(slots - 1);
    set.toggle(0);
    set.check(262143);
    set.toggle(262143);
    set.check(slots - 1);
}

TEST(the_free_slot_index, takes_little_more_than_a_bit_a_slot)
{
    EXPECT_EQ(rg_i_free_slot_index_words(1), 1u);
    EXPECT_EQ(rg_i_free_slot_index_words(64), 1u);
    EXPECT_EQ(rg_i_free_slot_index_words(65), 3u);
    EXPECT_EQ(rg_i_free_slot_index_words(4096), 65u);
    EXPECT_EQ(rg_i_free_slot_index_words(4097), 65u + 2 + 1);
    EXPECT_EQ(rg_i_free_slot_index_words(0xFFFFFFFFu), 67108864u + 1048576 + 16384 + 256 + 4 + 1);
}
