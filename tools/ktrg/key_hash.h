// SPDX-License-Identifier: MIT
// key_hash: the functions that the library asks for when a table is to find its keys by a hash table.
#pragma once

#include <cstdint>

#include "kt_rg.h"

namespace ktrg
{

struct key_hash {
    kt_uint32_t                       buckets   = 0; // 0: keys of this type can't be hashed by us
    rg_hash_function_t *              p_hash    = nullptr;
    rg_hash_keys_compare_function_t * p_compare = nullptr;
};

// For keys of the type, in a table of about so many rows.
[[nodiscard]] key_hash key_hash_for(kt_data_type_t type, std::uint64_t rows);

} // namespace ktrg
