// SPDX-License-Identifier: MIT
#include "common/kt_rg_rows.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <stdexcept>
#include <utility>

#include <fmt/format.h>

#include "kt_ku.h"

namespace bench
{

namespace
{

// To the upper bits, for a number of buckets that is a power of two. One function for each, since a function is told
// the key and nothing else.
template <int Bits> kt_uint32_t hash_id(void * p_key)
{
    std::uint64_t key;
    std::memcpy(&key, p_key, sizeof key);
    return static_cast<kt_uint32_t>((key * 0x9e3779b97f4a7c15u) >> (64 - Bits));
}

template <int Bits> kt_uint32_t hash_name(void * p_key)
{
    const std::string_view name = static_cast<const char *>(p_key);
    return hash_id<Bits>(std::array{digest(name) * 0xff51afd7ed558ccdu}.data());
}

kt_int32_t compare_ids(void * p_key1, void * p_key2)
{
    return std::memcmp(p_key1, p_key2, sizeof(std::uint64_t));
}

kt_int32_t compare_names(void * p_key1, void * p_key2)
{
    return std::strcmp(static_cast<const char *>(p_key1), static_cast<const char *>(p_key2));
}

constexpr int fewest_bits = 10;
constexpr int most_bits   = 24;

template <int... Bits> hashing hashing_of(bool names, int bits, std::integer_sequence<int, Bits...>)
{
    constexpr std::array ids_table{&hash_id<fewest_bits + Bits>...};
    constexpr std::array names_table{&hash_name<fewest_bits + Bits>...};
    const auto           i = static_cast<std::size_t>(bits - fewest_bits);
    return {1u << bits, names ? names_table[i] : ids_table[i], names ? compare_names : compare_ids};
}

} // namespace

void check(kt_int32_t code, const char * p_what)
{
    if (code == 0)
        return;
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    throw std::runtime_error(fmt::format("kt_rg: {}: {} {}", p_what, code, record.p_text));
}

hashing hashing_for(bool names, std::size_t rows)
{
    const int bits = std::clamp(static_cast<int>(std::bit_width(rows - 1)), fewest_bits, most_bits);
    return hashing_of(names, bits, std::make_integer_sequence<int, most_bits - fewest_bits + 1>());
}

} // namespace bench
