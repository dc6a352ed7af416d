// SPDX-License-Identifier: MIT
// rg_i_owned_hash_table: a hash table on its way to the table that will own it.
#pragma once

#include <utility>

#include "rg_i_hash_table.h"

// Closes the hash table, unless it has been handed on.
class owned_hash_table
{
  public:
    explicit owned_hash_table(rg_hash_table_t * p_hash_table) : p_hash_table_(p_hash_table) {}
    ~owned_hash_table() { rg_i_hash_table_close(p_hash_table_); }
    owned_hash_table(const owned_hash_table &)                          = delete;
    owned_hash_table &              operator=(const owned_hash_table &) = delete;
    [[nodiscard]] rg_hash_table_t * release() { return std::exchange(p_hash_table_, nullptr); }

  private:
    rg_hash_table_t * p_hash_table_;
};
