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

constexpr unsigned    word_shift     = 6; // 64 bits a word
constexpr kt_uint32_t bit_mask       = 63;
constexpr unsigned    maximum_levels = 6; // 64 to the sixth exceeds any number of slots

[[nodiscard]] size_t words_for(size_t bits)
{
    return (bits + bit_mask) >> word_shift;
}

[[nodiscard]] kt_uint64_t bit_of(size_t position)
{
    return kt_uint64_t{1} << (position & bit_mask);
}

// Where each level starts, the slots' own level first.
struct levels_t {
    size_t   start[maximum_levels];
    unsigned count;
};

[[nodiscard]] levels_t levels_for(kt_uint32_t total_slots)
{
    levels_t levels{};
    size_t   start = 0;
    size_t   bits  = total_slots;
    do {
        assert(levels.count < maximum_levels);
        levels.start[levels.count++] = start;
        bits                         = words_for(bits);
        start += bits;
    } while (bits > 1);
    return levels;
}

} // namespace

size_t rg_i_free_slot_index_words(kt_uint32_t total_slots)
{
    size_t words = 0;
    size_t bits  = total_slots;
    do {
        bits = words_for(bits);
        words += bits;
    } while (bits > 1);
    return words;
}

void rg_i_free_slot_index_fill(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t first_slot)
{
    std::memset(p_words, 0, rg_i_free_slot_index_words(total_slots) * sizeof *p_words);
    if (first_slot >= total_slots)
        return;

    // On each level the set bits reach from the first one to the end, so the next level's do too.
    const levels_t levels = levels_for(total_slots);
    size_t         first  = first_slot;
    size_t         bits   = total_slots;
    for (unsigned level = 0; level < levels.count; ++level) {
        kt_uint64_t * p_level    = p_words + levels.start[level];
        const size_t  first_word = first >> word_shift;
        const size_t  words      = words_for(bits);
        std::memset(p_level + first_word, 0xFF, (words - first_word) * sizeof *p_words);
        p_level[first_word] &= ~(bit_of(first) - 1);
        if ((bits & bit_mask) != 0)
            p_level[words - 1] &= bit_of(bits) - 1;
        first = first_word;
        bits  = words;
    }
}

bool rg_i_free_slot_index_contains(const kt_uint64_t * p_words, kt_uint32_t slot)
{
    return (p_words[slot >> word_shift] & bit_of(slot)) != 0;
}

void rg_i_free_slot_index_add(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    assert(slot < total_slots);
    const levels_t levels   = levels_for(total_slots);
    size_t         position = slot;
    for (unsigned level = 0; level < levels.count; ++level) {
        kt_uint64_t &     word   = p_words[levels.start[level] + (position >> word_shift)];
        const kt_uint64_t before = word;
        word |= bit_of(position);
        if (before != 0)
            return; // the levels above know this word
        position >>= word_shift;
    }
}

void rg_i_free_slot_index_remove(kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    assert(slot < total_slots);
    const levels_t levels   = levels_for(total_slots);
    size_t         position = slot;
    for (unsigned level = 0; level < levels.count; ++level) {
        kt_uint64_t & word = p_words[levels.start[level] + (position >> word_shift)];
        word &= ~bit_of(position);
        if (word != 0)
            return;
        position >>= word_shift;
    }
}

kt_uint32_t rg_i_free_slot_index_below(const kt_uint64_t * p_words, kt_uint32_t total_slots, kt_uint32_t slot)
{
    const levels_t levels   = levels_for(total_slots);
    size_t         position = slot;
    for (unsigned level = 0; level < levels.count; ++level) {
        const kt_uint64_t word = p_words[levels.start[level] + (position >> word_shift)] & (bit_of(position) - 1);
        position >>= word_shift;
        if (word == 0)
            continue;

        // Down again, always to the highest bit.
        position = (position << word_shift) + static_cast<size_t>(std::bit_width(word)) - 1;
        while (level-- > 0) {
            const kt_uint64_t below = p_words[levels.start[level] + position];
            assert(below != 0);
            position = (position << word_shift) + static_cast<size_t>(std::bit_width(below)) - 1;
        }
        return static_cast<kt_uint32_t>(position);
    }
    return RG_I_NO_SLOT;
}
