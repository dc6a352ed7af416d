// SPDX-License-Identifier: MIT
// kt_rg_rows: rows as this library's calls take them.
#ifndef BENCH_KT_RG_ROWS_H
#define BENCH_KT_RG_ROWS_H

#include <cstddef>

#include "common/rows.h"
#include "kt_rg.h"

namespace bench
{

// Throws if a call has failed, with the text of its error record.
void check(kt_int32_t code, const char * p_what);

// The hash function that a caller brings, as a creation takes it.
struct hashing {
    kt_uint32_t                       buckets;
    rg_hash_function_t *              p_hash;
    rg_hash_keys_compare_function_t * p_compare;
};

// Buckets for so many rows, each with one row or fewer.
hashing hashing_for(bool names, std::size_t rows);

inline char Id[]{"id"}, Count[]{"count"}, Ratio[]{"ratio"}, Name[]{"name"}, Note[]{"note"}, Added[]{"added"};

constexpr std::size_t columns = 5;

inline kt_value_t value_of(std::uint64_t id)
{
    kt_value_t value;
    value.val_uint64 = id;
    return value;
}

inline kt_value_t value_of(const name_text & name)
{
    kt_value_t value;
    value.ptr_char = const_cast<char *>(name.text);
    return value;
}

inline rg_column_t column(kt_char_ptr_t p_name, kt_data_type_t type, bool key)
{
    return {p_name, type, key ? kt_uint32_t{RG_PRIMARY_KEY} : kt_uint32_t{RG_STANDARD}, 0, nullptr, {}};
}

// A row's values.
struct row_values {
    row_values()
    {
        for (std::size_t i = 0; i < columns; ++i)
            pointers[i] = &values[i];
    }
    row_values(const row_values &)             = delete;
    row_values & operator=(const row_values &) = delete;

    void become(const row & r)
    {
        values[0].val_uint64  = r.id;
        values[1].val_int64   = r.count;
        values[2].val_float64 = r.ratio;
        values[3].ptr_char    = const_cast<char *>(r.name.text);
        values[4].ptr_char    = const_cast<char *>(r.note);
    }

    kt_char_ptr_t names[columns]{Id, Count, Ratio, Name, Note};
    kt_value_t    values[columns]{};
    kt_value_t *  pointers[columns];
};

} // namespace bench

#endif
