// SPDX-License-Identifier: MIT
// ku_expr_sets: the constants of a list as a set, for tests of columns. Internal.
//
// A set is a constant with the number of members, and behind it the members in ascending order of their keys. A key has
// 64 bits: a number's own, in the form of the column's type, or a digest of a string. Numbers with one key are equal,
// strings with one key need not be.
#pragma once

#include <bit>
#include <cstdint>

#include "ku_expr.h"
#include "ku_expr_stored.h"

// An integer within the range of its type.
inline uint64_t ku_set_key(ku_int_t value)
{
    return ku_int_bits(value);
}

// The two zeros are equal. NaN equals nothing, so it is in no set.
inline uint64_t ku_set_key(double value)
{
    return value == 0.0 ? 0 : std::bit_cast<uint64_t>(value);
}

inline uint64_t ku_set_key(const uint8_t * p, size_t length)
{
    constexpr uint64_t odd = 0x9E3779B97F4A7C15;
    uint64_t           key = length;
    const auto         mix = [&key](uint64_t word) {
        key = (key ^ word) * odd;
        key ^= key >> 32;
    };
    for (; length >= sizeof(uint64_t); p += sizeof(uint64_t), length -= sizeof(uint64_t))
        mix(ku_load<uint64_t>(p));
    uint64_t rest = 0;
    for (size_t i = 0; i < length; i++)
        rest |= static_cast<uint64_t>(p[i]) << 8 * i;
    mix(rest);
    return key;
}

// The set's first member with this key, or NULL. The steps are the same for all keys, so nothing is guessed wrongly.
inline const ku_constant_t * ku_set_find(const ku_constant_t * p_set, uint64_t key)
{
    const ku_constant_t * p = p_set + 1;
    for (kt_uint32_t left = p_set->set.members; left > 1;) {
        const kt_uint32_t half = left / 2;
        p += p[half - 1].member.key < key ? half : 0;
        left -= half;
    }
    return p->member.key == key ? p : nullptr;
}

inline bool ku_set_has_string(const ku_constant_t * p_set, const uint8_t * p_texts, const ku_extent_t & string)
{
    const uint64_t              key   = ku_set_key(string.p, string.length);
    const ku_constant_t * const p_end = p_set + 1 + p_set->set.members;
    for (const ku_constant_t * p_member = ku_set_find(p_set, key);
         p_member != nullptr && p_member != p_end && p_member->member.key == key; p_member++) {
        if (p_member->member.length == string.length &&
            std::memcmp(p_texts + p_member->member.offset, string.p, string.length) == 0)
            return true;
    }
    return false;
}
