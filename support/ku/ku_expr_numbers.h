// SPDX-License-Identifier: MIT
// ku_expr_numbers: exact arithmetic and comparison of the selection language's numbers. Internal.
//
// An integer of the language has a mathematical value from -2^63 to 2^64-1, wherever it comes from, and is held in 128
// bits. Compiler (folding) and evaluator use the same functions, so a constant is what a column would be.
#pragma once

#include <cmath>
#include <cstdint>

__extension__ typedef __int128          ku_int_t;
__extension__ typedef unsigned __int128 ku_wide_uint_t;

inline constexpr ku_int_t ku_int_lowest  = INT64_MIN;
inline constexpr ku_int_t ku_int_highest = UINT64_MAX;

inline constexpr bool ku_int_is_in_range(ku_int_t i)
{
    return i >= ku_int_lowest && i <= ku_int_highest;
}

// The 64 bits of an integer, negative ones in two's complement.
inline constexpr uint64_t ku_int_bits(ku_int_t i)
{
    return static_cast<uint64_t>(i);
}

// The distance from zero: at most 2^64-1, so it fits.
inline constexpr uint64_t ku_int_magnitude(ku_int_t i)
{
    return i < 0 ? static_cast<uint64_t>(-i) : static_cast<uint64_t>(i);
}

// Two integers in, one out; false if the result is out of range or doesn't exist.
using ku_int_operation_t = bool(ku_int_t left, ku_int_t right, ku_int_t * p_result);

inline bool ku_int_add(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    *p_result = left + right;
    return ku_int_is_in_range(*p_result);
}

inline bool ku_int_subtract(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    *p_result = left - right;
    return ku_int_is_in_range(*p_result);
}

inline bool ku_int_multiply(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    const ku_wide_uint_t product = static_cast<ku_wide_uint_t>(ku_int_magnitude(left)) * ku_int_magnitude(right);
    const bool           minus   = (left < 0) != (right < 0) && product != 0;
    if (product > (minus ? static_cast<ku_wide_uint_t>(1) << 63 : static_cast<ku_wide_uint_t>(UINT64_MAX)))
        return false;
    *p_result = minus ? -static_cast<ku_int_t>(product) : static_cast<ku_int_t>(product);
    return true;
}

inline bool ku_int_divide(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    if (right == 0)
        return false;
    const ku_int_t quotient = ku_int_magnitude(left) / ku_int_magnitude(right);
    *p_result               = (left < 0) != (right < 0) ? -quotient : quotient;
    return ku_int_is_in_range(*p_result);
}

inline bool ku_int_modulo(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    if (right == 0)
        return false;
    const ku_int_t remainder = ku_int_magnitude(left) % ku_int_magnitude(right);
    *p_result                = left < 0 ? -remainder : remainder;
    return true;
}

// The bits of a bit operator's result as a number: signed if an operand is negative.
inline ku_int_t ku_int_of_bits(uint64_t bits, ku_int_t left, ku_int_t right)
{
    if (left < 0 || right < 0)
        return static_cast<int64_t>(bits);
    return bits;
}

inline bool ku_int_bits_and(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    *p_result = ku_int_of_bits(ku_int_bits(left) & ku_int_bits(right), left, right);
    return true;
}

inline bool ku_int_bits_xor(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    *p_result = ku_int_of_bits(ku_int_bits(left) ^ ku_int_bits(right), left, right);
    return true;
}

inline bool ku_int_bits_or(ku_int_t left, ku_int_t right, ku_int_t * p_result)
{
    *p_result = ku_int_of_bits(ku_int_bits(left) | ku_int_bits(right), left, right);
    return true;
}

// The complement. width is 32 or 64 for the value of an unsigned column and 0 otherwise; then only a value above 2^63-1
// is unsigned.
inline ku_int_t ku_int_complement(ku_int_t i, unsigned width)
{
    if (width == 32)
        return static_cast<uint32_t>(~ku_int_bits(i));
    if (width == 64 || i > INT64_MAX)
        return ~ku_int_bits(i);
    return -i - 1;
}

// ---- Comparison ----

// How two values stand to each other, as one bit; a relation is the set of the orders that satisfy it.
enum ku_order_t : uint8_t { KU_LESS = 1, KU_EQUAL = 2, KU_GREATER = 4, KU_UNORDERED = 8 };
enum ku_relation_t : uint8_t {
    KU_EQ = KU_EQUAL,
    KU_NE = KU_LESS | KU_GREATER | KU_UNORDERED,
    KU_LT = KU_LESS,
    KU_LE = KU_LESS | KU_EQUAL,
    KU_GT = KU_GREATER,
    KU_GE = KU_GREATER | KU_EQUAL
};

inline uint8_t ku_compare_ints(ku_int_t left, ku_int_t right)
{
    return left == right ? KU_EQUAL : left < right ? KU_LESS : KU_GREATER;
}

// The order of two floating-point numbers, or 0 if they have none.
inline unsigned ku_order_of_floats(double left, double right)
{
    return static_cast<unsigned>(left < right) * KU_LESS + static_cast<unsigned>(left == right) * KU_EQUAL +
           static_cast<unsigned>(left > right) * KU_GREATER;
}

inline uint8_t ku_compare_floats(double left, double right)
{
    const unsigned order = ku_order_of_floats(left, right);
    return order != 0 ? static_cast<uint8_t>(order) : static_cast<uint8_t>(KU_UNORDERED);
}

inline constexpr double ku_two_to_63 = 9223372036854775808.0;
inline constexpr double ku_two_to_64 = 18446744073709551616.0;

// By mathematical value: neither side is rounded to the other's type.
inline uint8_t ku_compare_int_with_float(ku_int_t left, double right)
{
    if (std::isnan(right))
        return KU_UNORDERED;
    if (right >= ku_two_to_64)
        return KU_LESS;
    if (right < -ku_two_to_63)
        return KU_GREATER;
    const ku_int_t whole = static_cast<ku_int_t>(right); // towards zero
    if (left != whole)
        return left < whole ? KU_LESS : KU_GREATER;
    return ku_compare_floats(0.0, right - static_cast<double>(whole)); // the difference is exact
}

inline uint8_t ku_mirrored(uint8_t order_or_relation)
{
    const unsigned bits = order_or_relation;
    return static_cast<uint8_t>((bits & (KU_EQUAL | KU_UNORDERED)) | (bits & KU_LESS) << 2 | (bits & KU_GREATER) >> 2);
}

inline uint8_t ku_compare_float_with_int(double left, ku_int_t right)
{
    return ku_mirrored(ku_compare_int_with_float(right, left));
}
