// SPDX-License-Identifier: MIT
// ku_expr_stored: reads stored values, which may be damaged, within the bounds of what encloses them. Internal.
//
// The forms are those of docs/PACKED-FORMAT.md: a slot of eight bytes that holds a scalar, or an offset and a length
// into the enclosing item. Nothing is aligned. Every function answers whether the value is well formed, and reads
// nothing that lies outside its bounds.
#pragma once

#include <cstdint>
#include <cstring>

#include "ku_expr.h"

inline constexpr size_t ku_slot_size          = 8;
inline constexpr size_t ku_array_head_size    = 8;  // element_count, pad
inline constexpr size_t ku_sd_element_size    = 16; // data_type, pad, slot
inline constexpr size_t ku_binary_length_size = 4;

// A value on the machine's stack; which member counts was settled by the compiler.
union ku_value_t {
    ku_int_t integer; // truth values are 0 and 1
    double   floating;
    struct {
        const uint8_t * p;      // a string, bytes, or the item of an array or structure
        kt_uint32_t     length; // of an item, its length is the bound of what it holds
        kt_uint32_t     letters;
    } bytes;
};
static_assert(sizeof(ku_value_t) == 16);

// Where values are read from.
struct ku_extent_t {
    const uint8_t * p;
    kt_uint32_t     length;
};

template <class T> inline T ku_load(const uint8_t * p)
{
    T value;
    std::memcpy(&value, p, sizeof value);
    return value;
}

// The item that a slot points to.
inline bool ku_read_item(const uint8_t * p_slot, const ku_extent_t & within, ku_extent_t * p_item)
{
    const kt_uint32_t offset = ku_load<kt_uint32_t>(p_slot), length = ku_load<kt_uint32_t>(p_slot + 4);
    if (static_cast<uint64_t>(offset) + length > within.length)
        return false;
    *p_item = {within.p + offset, length};
    return true;
}

// Whether a string's item has a terminator; as a rule it is its last byte.
inline bool ku_item_is_terminated(const ku_extent_t & item)
{
    if (item.length == 0)
        return false;
    return item.p[item.length - 1] == '\0' || std::memchr(item.p, '\0', item.length) != nullptr;
}

// The length of a string whose item is terminated.
inline kt_uint32_t ku_string_length(const ku_extent_t & item)
{
    return static_cast<kt_uint32_t>(static_cast<const uint8_t *>(std::memchr(item.p, '\0', item.length)) - item.p);
}

inline bool ku_read_string(const uint8_t * p_slot, const ku_extent_t & within, ku_value_t * p_value)
{
    ku_extent_t item;
    if (!ku_read_item(p_slot, within, &item) || item.length == 0)
        return false;
    const void * p_terminator = std::memchr(item.p, '\0', item.length);
    if (p_terminator == nullptr)
        return false;
    p_value->bytes = {item.p, static_cast<kt_uint32_t>(static_cast<const uint8_t *>(p_terminator) - item.p),
                      KU_LETTERS_AS_THEY_ARE};
    return true;
}

inline bool ku_read_binary(const uint8_t * p_slot, const ku_extent_t & within, ku_value_t * p_value)
{
    ku_extent_t item;
    if (!ku_read_item(p_slot, within, &item) || item.length < ku_binary_length_size)
        return false;
    const kt_uint32_t length = ku_load<kt_uint32_t>(item.p);
    if (length > item.length - ku_binary_length_size)
        return false;
    p_value->bytes = {item.p + ku_binary_length_size, length, KU_LETTERS_AS_THEY_ARE};
    return true;
}

inline bool ku_read_handle(const uint8_t * p_slot, const ku_extent_t & within, ku_value_t * p_value)
{
    ku_extent_t item;
    if (!ku_read_item(p_slot, within, &item) || item.length < sizeof(kt_resource_handle_t))
        return false;
    p_value->bytes = {item.p, sizeof(kt_resource_handle_t), KU_LETTERS_AS_THEY_ARE};
    return true;
}

// An array or a structure: its head, and room for as many elements as it says.
inline bool ku_read_container(const uint8_t * p_slot, const ku_extent_t & within, size_t element_size,
                              ku_value_t * p_value)
{
    ku_extent_t item;
    if (!ku_read_item(p_slot, within, &item) || item.length < ku_array_head_size)
        return false;
    if (ku_load<kt_uint32_t>(item.p) * static_cast<uint64_t>(element_size) > item.length - ku_array_head_size)
        return false;
    p_value->bytes = {item.p, item.length, KU_LETTERS_AS_THEY_ARE};
    return true;
}

// The number of elements of what ku_read_container has read.
inline kt_uint32_t ku_element_count(const ku_value_t & container)
{
    return ku_load<kt_uint32_t>(container.bytes.p);
}

// The value of a type in a slot.
inline bool ku_read_value(kt_data_type_t type, const uint8_t * p_slot, const ku_extent_t & within, ku_value_t * p_value)
{
    switch (type) {
    case KT_INT32:
        p_value->integer = ku_load<kt_int32_t>(p_slot);
        return true;
    case KT_UINT32:
        p_value->integer = ku_load<kt_uint32_t>(p_slot);
        return true;
    case KT_INT64:
        p_value->integer = ku_load<kt_int64_t>(p_slot);
        return true;
    case KT_UINT64:
        p_value->integer = ku_load<kt_uint64_t>(p_slot);
        return true;
    case KT_FLOAT32:
        p_value->floating = static_cast<double>(ku_load<kt_float32_t>(p_slot));
        return true;
    case KT_FLOAT64:
        p_value->floating = ku_load<kt_float64_t>(p_slot);
        return true;
    case KT_CHAR_PTR:
        return ku_read_string(p_slot, within, p_value);
    case KT_BINARY_PTR:
        return ku_read_binary(p_slot, within, p_value);
    case KT_RSRC_HANDLE_PTR:
        return ku_read_handle(p_slot, within, p_value);
    case KT_SD_PTR:
        return ku_read_container(p_slot, within, ku_sd_element_size, p_value);
    default: // the arrays; the compiler lets no other type through
        return ku_read_container(p_slot, within, ku_slot_size, p_value);
    }
}
