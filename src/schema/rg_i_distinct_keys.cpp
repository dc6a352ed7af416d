// SPDX-License-Identifier: MIT
// rg_i_distinct_keys: see rg_i_distinct_keys.h.
//
// Layer: schema. Called where all rows of a table are added to another.
// Always holds: equal keys give equal words, so that words that are all different tell that the keys are. Where a key
// doesn't behave like that (a NaN equals everything, a string is converted on its way, a record is damaged) the answer
// is false, and the adds look for themselves.
// Locking: the caller holds the table's lock.
// Failure: none. Without memory for the words the answer is false.
#include "schema/rg_i_distinct_keys.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"

namespace
{

constexpr kt_uint32_t rows_that_are_worth_it = 64;

[[nodiscard]] bool strings_are_stored_as_they_are(const rg_i_tree_t * p_tree)
{
    return p_tree == nullptr || (ku_iconv_is_identity_1(p_tree->p_to_table_string_conversion_handle) != 0 &&
                                 ku_iconv_is_identity_1(p_tree->p_from_table_string_conversion_handle) != 0);
}

// FNV-1a, up to the first terminator, as far as a comparison goes.
[[nodiscard]] kt_uint64_t word_of_string(const kt_char_t * p)
{
    kt_uint64_t word = 0xCBF29CE484222325u;
    for (; *p != '\0'; ++p)
        word = (word ^ static_cast<unsigned char>(*p)) * 0x100000001B3u;
    return word;
}

// The two zeros are equal.
template <class Float> [[nodiscard]] bool word_of_float(Float number, kt_uint64_t * p_word)
{
    const double wide = number == 0 ? 0.0 : static_cast<double>(number);
    std::memcpy(p_word, &wide, sizeof wide);
    return !std::isnan(number);
}

[[nodiscard]] bool word_of_key(const rg_i_table_t * p_table, kt_char_ptr_t p_record, kt_uint64_t * p_word)
{
    const kt_char_t * const p_key = rg_i_row_key(p_table, p_record);
    if (p_key == nullptr)
        return false;
    kt_value_t value;
    switch (p_table->p_columns[0].type) {
    case KT_INT32:
    case KT_UINT32:
        *p_word = rg_i_load_u32(p_key);
        return true;
    case KT_INT64:
    case KT_UINT64:
        std::memcpy(p_word, p_key, sizeof *p_word);
        return true;
    case KT_FLOAT32:
        std::memcpy(&value, p_key, sizeof value);
        return word_of_float(value.val_float32, p_word);
    case KT_FLOAT64:
        std::memcpy(&value, p_key, sizeof value);
        return word_of_float(value.val_float64, p_word);
    case KT_CHAR_PTR:
        *p_word = word_of_string(p_key);
        return strings_are_stored_as_they_are(p_table->p_tree);
    default:
        return false;
    }
}

} // namespace

bool rg_i_keys_are_distinct(const rg_i_table_t * p_table)
{
    const kt_uint32_t total_rows = p_table->total_applied_rows;
    if (total_rows < rows_that_are_worth_it)
        return false;
    const owned_ptr<kt_uint64_t> words(
        static_cast<kt_uint64_t *>(std::malloc(size_t{total_rows} * sizeof(kt_uint64_t))));
    if (!words)
        return false;

    for (kt_uint32_t position = 0; position < total_rows; ++position) {
        const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[p_table->p_rows_packed_index[position]];
        const kt_char_ptr_t p_record = p_table->uncommitted_updates_visible != 0 ? entry.p_applied : entry.p_committed;
        if (p_record == nullptr || !word_of_key(p_table, p_record, words.get() + position))
            return false;
    }
    std::sort(words.get(), words.get() + total_rows);
    return std::adjacent_find(words.get(), words.get() + total_rows) == words.get() + total_rows;
}
