// SPDX-License-Identifier: MIT
// ku_expr_types: what the data types are to the selection language, and literals that stand for bytes.
#include "ku_expr.h"

#include <cstring>

ku_expr_kind_t ku_expr_kind_of_type(kt_data_type_t type)
{
    switch (type) {
    case KT_INT32:
    case KT_UINT32:
    case KT_INT64:
    case KT_UINT64:
        return KU_KIND_INTEGER;
    case KT_FLOAT32:
    case KT_FLOAT64:
        return KU_KIND_FLOATING;
    case KT_CHAR_PTR:
        return KU_KIND_STRING;
    case KT_BINARY_PTR:
        return KU_KIND_BINARY;
    case KT_RSRC_HANDLE_PTR:
        return KU_KIND_HANDLE;
    case KT_SD_PTR:
        return KU_KIND_STRUCTURE;
    default:
        return type >= KT_INT32_ARRAY && type <= KT_SD_PTR_ARRAY ? KU_KIND_ARRAY : KU_KIND_OPAQUE;
    }
}

// Elements have the types from KT_INT32 to KT_SD_PTR, in the order of the array types.
kt_data_type_t ku_expr_element_type(kt_data_type_t array_type)
{
    static_assert(KT_SD_PTR_ARRAY - KT_INT32_ARRAY == KT_SD_PTR - KT_INT32);
    return array_type - KT_INT32_ARRAY + KT_INT32;
}

unsigned ku_expr_unsigned_width(kt_data_type_t type)
{
    return type == KT_UINT32 ? 32 : type == KT_UINT64 ? 64 : 0;
}

const kt_char_t * ku_expr_kind_name(ku_expr_kind_t kind)
{
    switch (kind) {
    case KU_KIND_INTEGER:
        return "an integer";
    case KU_KIND_FLOATING:
        return "a floating-point number";
    case KU_KIND_STRING:
        return "a string";
    case KU_KIND_BINARY:
        return "a binary";
    case KU_KIND_HANDLE:
        return "a resource handle";
    case KU_KIND_ARRAY:
        return "an array";
    case KU_KIND_STRUCTURE:
        return "structured data";
    case KU_KIND_OPAQUE:
        break;
    }
    return "a value of a type that no operator takes";
}

// ---- Literals that stand for bytes ----

namespace
{

int hex_digit(uint8_t c)
{
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

bool begins_with_0x(const uint8_t * p, size_t length)
{
    return length >= 2 && p[0] == '0' && p[1] == 'x';
}

// "0x" and two digits for each byte.
bool read_byte_digits(const uint8_t * p, size_t length, uint8_t * p_bytes, size_t * p_count)
{
    if (!begins_with_0x(p, length) || length % 2 != 0)
        return false;
    *p_count = length / 2 - 1;
    for (size_t i = 0; i < *p_count; i++) {
        const int high = hex_digit(p[2 + 2 * i]), low = hex_digit(p[3 + 2 * i]);
        if (high < 0 || low < 0)
            return false;
        p_bytes[i] = static_cast<uint8_t>(high * 16 + low);
    }
    return true;
}

// "0x" and exactly so many digits.
bool read_word(const uint8_t *& p, size_t digits, kt_uint32_t * p_word)
{
    if (!begins_with_0x(p, 2))
        return false;
    p += 2;
    *p_word = 0;
    for (size_t i = 0; i < digits; i++, p++) {
        const int digit = hex_digit(*p);
        if (digit < 0)
            return false;
        *p_word = *p_word << 4 | static_cast<kt_uint32_t>(digit);
    }
    return true;
}

// As the criteria variable $RH renders a handle: the low and the high half of the header, and then id1 to id4.
bool read_handle_words(const uint8_t * p, size_t length, uint8_t * p_bytes, size_t * p_count)
{
    constexpr size_t rendered_length = 57;
    if (length != rendered_length)
        return false;
    kt_uint32_t low = 0, words[5];
    if (!read_word(p, 4, &low) || *p++ != ' ' || !read_word(p, 4, &words[0]))
        return false;
    words[0] = words[0] << 16 | low;
    for (size_t i = 1; i < 5; i++) {
        if (*p++ != ' ' || !read_word(p, 8, &words[i]))
            return false;
    }
    static_assert(sizeof words == sizeof(kt_resource_handle_t));
    std::memcpy(p_bytes, words, sizeof words);
    *p_count = sizeof words;
    return true;
}

} // namespace

bool ku_expr_bytes_of_literal(const uint8_t * p_text, size_t length, uint8_t * p_bytes, size_t * p_count)
{
    return read_byte_digits(p_text, length, p_bytes, p_count) || read_handle_words(p_text, length, p_bytes, p_count);
}
