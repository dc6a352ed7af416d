// SPDX-License-Identifier: MIT
// key_hash: hashes of keys as they lie in row records, at any alignment.
//
// The bucket count is part of the function, since the library passes nothing but the key: a function of the type for
// each of four sizes.
#include "key_hash.h"

#include <cstring>
#include <string_view>

#include "kt_ku.h"

namespace ktrg
{

namespace
{

std::uint64_t mixed(std::uint64_t x)
{
    x ^= x >> 32U;
    x *= 0xd6e8feb86659fd93U;
    x ^= x >> 32U;
    x *= 0xd6e8feb86659fd93U;
    return x ^ (x >> 32U);
}

template <typename scalar> scalar scalar_at(const void * p_key)
{
    scalar value;
    std::memcpy(&value, p_key, sizeof value);
    return value;
}

// What is hashed and compared of a key of each kind. Equal keys have equal words: so both zeros are one, and all NaNs.
template <typename scalar> struct integer_key {
    static std::uint64_t word(const void * p_key) { return static_cast<std::uint64_t>(scalar_at<scalar>(p_key)); }
    static bool          equal(const void * p_a, const void * p_b) { return word(p_a) == word(p_b); }
};

template <typename scalar> struct real_key {
    static std::uint64_t word(const void * p_key)
    {
        const double value = static_cast<double>(scalar_at<scalar>(p_key));
        if (value != value)
            return 0x7ff8000000000000U;
        return value == 0.0 ? 0 : scalar_at<std::uint64_t>(&value);
    }
    static bool equal(const void * p_a, const void * p_b) { return word(p_a) == word(p_b); }
};

struct string_key {
    static std::uint64_t word(const void * p_key)
    {
        std::uint64_t hash = 0xcbf29ce484222325U;
        for (const auto * p = static_cast<const unsigned char *>(p_key); *p != 0; p++)
            hash = (hash ^ *p) * 0x100000001b3U;
        return hash;
    }
    static bool equal(const void * p_a, const void * p_b)
    {
        return std::strcmp(static_cast<const char *>(p_a), static_cast<const char *>(p_b)) == 0;
    }
};

template <typename key, unsigned bits> kt_uint32_t bucket_of(void * p_key)
{
    return static_cast<kt_uint32_t>(mixed(key::word(p_key)) & ((1U << bits) - 1));
}

template <typename key> kt_int32_t differ(void * p_key1, void * p_key2)
{
    return key::equal(p_key1, p_key2) ? 0 : 1;
}

template <typename key> key_hash sized(std::uint64_t rows)
{
    if (rows <= 1U << 10U)
        return {1U << 10U, bucket_of<key, 10>, differ<key>};
    if (rows <= 1U << 15U)
        return {1U << 15U, bucket_of<key, 15>, differ<key>};
    if (rows <= 1U << 18U)
        return {1U << 18U, bucket_of<key, 18>, differ<key>};
    return {1U << 21U, bucket_of<key, 21>, differ<key>};
}

} // namespace

key_hash key_hash_for(kt_data_type_t type, std::uint64_t rows)
{
    switch (type) {
    case KT_INT32:
        return sized<integer_key<kt_int32_t>>(rows);
    case KT_UINT32:
        return sized<integer_key<kt_uint32_t>>(rows);
    case KT_INT64:
        return sized<integer_key<kt_int64_t>>(rows);
    case KT_UINT64:
        return sized<integer_key<kt_uint64_t>>(rows);
    case KT_FLOAT32:
        return sized<real_key<kt_float32_t>>(rows);
    case KT_FLOAT64:
        return sized<real_key<kt_float64_t>>(rows);
    case KT_CHAR_PTR:
        return sized<string_key>(rows);
    default:
        return {}; // handles: the library hashes them by itself
    }
}

} // namespace ktrg
