// SPDX-License-Identifier: MIT
// foreign: turns a buffer's words, each after what it leads to.
#include "foreign.h"

#include <algorithm>
#include <cstdint>
#include <cstring>

#include "common/require.h"
#include "kt_types.h"

namespace growth
{

namespace
{

constexpr std::size_t directory  = 40;
constexpr std::size_t row_head   = 24;
constexpr std::size_t row_type   = 12; // the place of the word in a row's head
constexpr std::size_t arch_props = 5;

std::uint32_t word(const char * p_at)
{
    std::uint32_t value;
    std::memcpy(&value, p_at, sizeof value);
    return value;
}

void turn(char * p_at, std::size_t length)
{
    std::reverse(p_at, p_at + length);
}

void turn_value(char * p_slot, std::uint32_t type, char * p_items);

// Structured data: elements that tell their types.
void turn_structured(char * p_item)
{
    const std::uint32_t total = word(p_item);
    for (std::uint32_t i = 0; i < total; ++i) {
        char * p_element = p_item + 8 + 16 * std::size_t{i};
        turn_value(p_element + 8, word(p_element), p_item);
        turn(p_element, 4);
    }
    turn(p_item, 4);
}

void turn_array(char * p_item, std::uint32_t element_type)
{
    const std::uint32_t total = word(p_item);
    for (std::uint32_t i = 0; i < total; ++i)
        turn_value(p_item + 8 + 8 * std::size_t{i}, element_type, p_item);
    turn(p_item, 4);
}

void turn_value(char * p_slot, std::uint32_t type, char * p_items)
{
    char * p_item = p_items + word(p_slot);
    switch (type) {
    case KT_INT32:
    case KT_UINT32:
    case KT_FLOAT32:
        return turn(p_slot, 4);
    case KT_INT64:
    case KT_UINT64:
    case KT_FLOAT64:
        return turn(p_slot, 8);
    case KT_CHAR_PTR:
        break;
    case KT_BINARY_PTR:
        turn(p_item, 4);
        break;
    case KT_SD_PTR:
        turn_structured(p_item);
        break;
    case KT_BINARY_PTR_ARRAY:
    case KT_SD_PTR_ARRAY:
        turn_array(p_item, type - (KT_BINARY_PTR_ARRAY - KT_BINARY_PTR));
        break;
    default:
        bench::require(false, "a packed buffer holds more than it should");
    }
    turn(p_slot, 4);
    turn(p_slot + 4, 4);
}

// The rows' contents, which an array of binaries doesn't tell.
void turn_rows(char * p_array)
{
    constexpr std::uint32_t types[] = {KT_UINT64, KT_INT64, KT_FLOAT64, KT_CHAR_PTR, KT_CHAR_PTR};
    const std::uint32_t     total   = word(p_array);
    for (std::uint32_t i = 0; i < total; ++i) {
        char * p_row  = p_array + word(p_array + 8 + 8 * std::size_t{i});
        char * p_slot = p_row + row_head;
        char * p_data = p_slot + 8 * std::size(types);
        turn(p_row + row_type, 4);
        for (const std::uint32_t type : types) {
            turn_value(p_slot, type, p_data);
            p_slot += 8;
        }
    }
}

} // namespace

void turn_to_foreign_order(char * p_buffer)
{
    char * p_slots = p_buffer + directory;
    char * p_items = p_slots + 32;
    turn_rows(p_items + word(p_slots + 24));
    turn_value(p_slots, KT_CHAR_PTR, p_items);
    turn_value(p_slots + 8, KT_SD_PTR, p_items);
    turn_value(p_slots + 16, KT_SD_PTR_ARRAY, p_items);
    turn_value(p_slots + 24, KT_BINARY_PTR_ARRAY, p_items);
    for (char * p_word : {p_buffer, p_buffer + 8, p_buffer + 16, p_buffer + 24, p_buffer + 32})
        turn(p_word, 4);
    p_buffer[arch_props] ^= 1;
}

} // namespace growth
