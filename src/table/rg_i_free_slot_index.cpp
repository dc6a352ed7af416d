// SPDX-License-Identifier: MIT
// rg_i_free_slot_index: see the header.
//
// Layer: table. Called by rg_i_table alone.
// Always holds: a bit of an upper level is set exactly if the word that it stands for isn't zero.
#include "rg_i_free_slot_index.h"

#include <bit>
#include <cassert>
#include <cstring>

namespace
{

constexpr unsigned word_shift     = 6; // 64 bits a word
constexpr size_t   bit_mask       = 63;
constexpr unsigned maximum_levels = 6; // 64 to the sixth exceeds any number of slots

[[nodiscard]] size_t words_for(size_t bits)
{
    return (bits + bit_mask) >> word_shift;
}

[[nodiscard]] kt_uint64_t bit_of(size_t position)
{
    return kt_uint64_t{1} << (position & bit_mask);
}

// One level of the set: where its words start, and how many bits it has. The slots' own level starts at 0.
struct level_t {
    size_t start;
    size_t bits;

    [[nodiscard]] size_t  word_at(size_t position) const { return start + (position >> word_shift); }
    [[nodiscard]] bool    is_top() const { return bits <= bit_mask + 1; }
    [[nodiscard]] level_t above() const { return {start + words_for(bits), words_for(bits)}; }
};

[[nodiscard]] size_t highest_bit(kt_uint64_t word)
{
    return static_cast<size_t>(std::bit_width(word)) - 1;
}

} // namespace

size_t rg_i_free_slot_index_words(kt_uint32_t total_slots)
{
    level_t level{0, total_slots};
    while (!level.is_top())
        level = level.above();
    return level.start + words_for(level.bits);
}

void rg_i_free_slot_index_fill(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t first_slot)
{
    std::memset(p_words, 0, rg_i_free_slot_index_words(total_slots) * sizeof *p_words);
    if (first_slot >= total_slots)
        return;

    // On each level the set bits reach from the first one to the end, so the next level's do too.
    size_t first = first_slot;
    for (level_t level{0, total_slots};; level = level.above(), first >>= word_shift) {
        kt_uint64_t * p_first_word = p_words + level.word_at(first);
        kt_uint64_t * p_last_word  = p_words + level.word_at(level.bits - 1);
        std::memset(p_first_word, 0xFF, static_cast<size_t>(p_last_word + 1 - p_first_word) * sizeof *p_words);
        *p_first_word &= ~(bit_of(first) - 1);
        if ((level.bits & bit_mask) != 0)
            *p_last_word &= bit_of(level.bits) - 1;
        if (level.is_top())
            return;
    }
}

bool rg_i_free_slot_index_contains(const kt_uint64_t * p_words, kt_uint32_t slot)
{
    return (p_words[slot >> word_shift] & bit_of(slot)) != 0;
}

void rg_i_free_slot_index_add(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    assert(slot < total_slots);
    size_t position = slot;
    for (level_t level{0, total_slots};; level = level.above(), position >>= word_shift) {
        kt_uint64_t &     word   = p_words[level.word_at(position)];
        const kt_uint64_t before = word;
        word |= bit_of(position);
        if (before != 0 || level.is_top())
            return; // the levels above know of a word that isn't zero
    }
}

void rg_i_free_slot_index_remove(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    assert(slot < total_slots);
    size_t position = slot;
    for (level_t level{0, total_slots};; level = level.above(), position >>= word_shift) {
        kt_uint64_t & word = p_words[level.word_at(position)];
        word &= ~bit_of(position);
        if (word != 0 || level.is_top())
            return;
    }
}

kt_uint32_t rg_i_free_slot_index_below(const kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    size_t   starts[maximum_levels];
    unsigned climbed  = 0;
    size_t   position = slot;
    for (level_t level{0, total_slots};; level = level.above()) {
        assert(climbed < maximum_levels);
        starts[climbed]        = level.start;
        const kt_uint64_t word = p_words[level.word_at(position)] & (bit_of(position) - 1);
        position >>= word_shift;
        if (word != 0) {
            // Down again, always to the highest bit.
            position = (position << word_shift) + highest_bit(word);
            while (climbed-- > 0)
                position = (position << word_shift) + highest_bit(p_words[starts[climbed] + position]);
            return static_cast<kt_uint32_t>(position);
        }
        if (level.is_top())
            return RG_I_NO_SLOT;
        ++climbed;
    }
}
