// SPDX-License-Identifier: MIT
// ku_utf8: characters in bytes that may or may not be UTF-8. Internal to the utility library.
#pragma once

#include <cstddef>
#include <cstdint>

// Reads the character at p, which is below p_end. Returns its length, or 0 if no well-formed character stands there:
// stray and missing continuation bytes, overlong forms, surrogates and what lies beyond U+10FFFF aren't.
inline size_t ku_utf8_read(const uint8_t * p, const uint8_t * p_end, uint32_t * p_character)
{
    const uint32_t lead = p[0];
    if (lead < 0x80) {
        *p_character = lead;
        return 1;
    }
    const size_t left      = static_cast<size_t>(p_end - p);
    const auto   continues = [p](size_t i) { return (p[i] & 0xC0) == 0x80; };
    const auto   bits      = [p](size_t i) { return static_cast<uint32_t>(p[i] & 0x3F); };
    if (lead >= 0xC2 && lead <= 0xDF && left >= 2 && continues(1)) {
        *p_character = (lead & 0x1F) << 6 | bits(1);
        return 2;
    }
    if (lead >= 0xE0 && lead <= 0xEF && left >= 3 && continues(1) && continues(2)) {
        const uint32_t character = (lead & 0x0F) << 12 | bits(1) << 6 | bits(2);
        *p_character             = character;
        return character >= 0x800 && (character < 0xD800 || character > 0xDFFF) ? 3 : 0;
    }
    if (lead >= 0xF0 && lead <= 0xF4 && left >= 4 && continues(1) && continues(2) && continues(3)) {
        const uint32_t character = (lead & 0x07) << 18 | bits(1) << 12 | bits(2) << 6 | bits(3);
        *p_character             = character;
        return character >= 0x10000 && character <= 0x10FFFF ? 4 : 0;
    }
    return 0;
}

// Bytes to the next character: a byte that isn't part of a well-formed one counts as one.
inline size_t ku_utf8_step(const uint8_t * p, const uint8_t * p_end)
{
    uint32_t     character = 0;
    const size_t length    = ku_utf8_read(p, p_end, &character);
    return length != 0 ? length : 1;
}
