// SPDX-License-Identifier: MIT
// kt_pmsg_i_forms: what building, reading and converting know in common about values: the form of each type's item, the
// words in either byte order, and the shape that arrays and structured data share.
//
// A client value and its stored item have the same shape byte for byte, with one difference: where the client value
// holds a pointer, the item holds an anchor. So one description serves both sides, and a run of scalars is copied as it
// stands. Nothing here assumes alignment: client values may be items inside a record, and items lie anywhere.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "kt_pmsg.h"

namespace kt_pmsg_i
{

// ---- Forms ---------------------------------------------------------------------------------------------------------

enum class item_form : std::uint8_t {
    none,       // not a type of values
    word32,     // in the slot: its first four bytes
    word64,     // in the slot: all eight
    string,     // bytes and a terminating zero
    binary,     // u32 length, then that many bytes
    handle,     // five u32
    structured, // head, then entries of type, pad and slot
    sbs,        // i32 length, then that many bytes of fields
    array       // head, then slots
};

inline constexpr std::array<item_form, KU_DTC_TYPES> item_forms = {
    item_form::none,       // KT_UNKNOWN
    item_form::none,       // KT_NONE
    item_form::word32,     // KT_INT32
    item_form::word32,     // KT_UINT32
    item_form::word64,     // KT_INT64
    item_form::word64,     // KT_UINT64
    item_form::word32,     // KT_FLOAT32
    item_form::word64,     // KT_FLOAT64
    item_form::string,     // KT_CHAR_PTR
    item_form::binary,     // KT_BINARY_PTR
    item_form::handle,     // KT_RSRC_HANDLE_PTR
    item_form::structured, // KT_SD_PTR
    item_form::sbs,        // KT_SBS_PTR
    item_form::array,      // KT_INT32_ARRAY
    item_form::array,      // KT_UINT32_ARRAY
    item_form::array,      // KT_INT64_ARRAY
    item_form::array,      // KT_UINT64_ARRAY
    item_form::array,      // KT_FLOAT32_ARRAY
    item_form::array,      // KT_FLOAT64_ARRAY
    item_form::array,      // KT_CHAR_PTR_ARRAY
    item_form::array,      // KT_BINARY_PTR_ARRAY
    item_form::array,      // KT_RSRC_HANDLE_PTR_ARRAY
    item_form::array       // KT_SD_PTR_ARRAY
};
static_assert(item_forms[KT_CHAR_PTR] == item_form::string && item_forms[KT_SBS_PTR] == item_form::sbs &&
              item_forms[KT_INT32_ARRAY] == item_form::array && item_forms[KT_SD_PTR_ARRAY] == item_form::array);

// The array types stand in the order of their element types, the SBS alone having none.
inline constexpr kt_data_type_t array_type_distance = KT_INT32_ARRAY - KT_INT32;
static_assert(KT_FLOAT64_ARRAY - KT_FLOAT64 == array_type_distance);
static_assert(KT_CHAR_PTR_ARRAY - KT_CHAR_PTR == array_type_distance);
static_assert(KT_SD_PTR_ARRAY - KT_SD_PTR == array_type_distance);

[[nodiscard]] inline item_form form_of(kt_data_type_t type)
{
    return type < item_forms.size() ? item_forms[type] : item_form::none;
}

[[nodiscard]] inline bool is_scalar(item_form form)
{
    return form == item_form::word32 || form == item_form::word64;
}

// Bytes of the fixed heads of items.
inline constexpr std::uint32_t length_word_length = 4; // of a binary and of an SBS
inline constexpr std::uint32_t handle_length      = sizeof(kt_resource_handle_t);
inline constexpr std::uint32_t list_head_length   = 8; // element_count and pad

// The bound that stands for none.
inline constexpr kt_pmsg_len_t no_bound = 0xFFFFFFFF;

// ---- Words ---------------------------------------------------------------------------------------------------------

enum class word_order { local, foreign };

[[nodiscard]] constexpr word_order opposite(word_order order)
{
    return order == word_order::local ? word_order::foreign : word_order::local;
}

template <class Word> [[nodiscard]] Word reversed(Word word)
{
    static_assert(sizeof(Word) == 2 || sizeof(Word) == 4 || sizeof(Word) == 8);
    if constexpr (sizeof(Word) == 2)
        return static_cast<Word>(__builtin_bswap16(word));
    else if constexpr (sizeof(Word) == 4)
        return __builtin_bswap32(word);
    else
        return __builtin_bswap64(word);
}

template <class Word, word_order Order = word_order::local> [[nodiscard]] Word load(const std::byte * p)
{
    Word word;
    std::memcpy(&word, p, sizeof word);
    return Order == word_order::local ? word : reversed(word);
}

template <class Word> void store(std::byte * p, Word word)
{
    std::memcpy(p, &word, sizeof word);
}

template <class Word> void reverse_in_place(std::byte * p)
{
    store(p, reversed(load<Word>(p)));
}

inline constexpr auto load_u32 = load<std::uint32_t>;

template <word_order Order = word_order::local>
[[nodiscard]] kt_pmsg_value_anchor_t load_anchor(const std::byte * p_slot)
{
    return {load<std::uint32_t, Order>(p_slot), load<std::uint32_t, Order>(p_slot + 4)};
}

inline void store_anchor(std::byte * p_slot, std::uint64_t offset, std::uint64_t length)
{
    store(p_slot, static_cast<std::uint32_t>(offset));
    store(p_slot + 4, static_cast<std::uint32_t>(length));
}

// ---- Scalars -------------------------------------------------------------------------------------------------------

// A 32-bit scalar leaves half of its slot over. That half is always written as zero: items are then the same bytes for
// the same values, and a reader that takes the slot for a pointer sees a clean one.
inline void copy_word32_slots(std::byte * p_to, const std::byte * p_from, std::uint32_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        const std::uint32_t slot[2] = {load_u32(p_from + i * 8), 0};
        std::memcpy(p_to + i * 8, slot, sizeof slot);
    }
}

inline void copy_scalar(item_form form, std::byte * p_to, const std::byte * p_from)
{
    if (form == item_form::word32)
        copy_word32_slots(p_to, p_from, 1);
    else
        std::memcpy(p_to, p_from, 8);
}

// ---- Arrays and structured data ------------------------------------------------------------------------------------

// The list of slots that an array or structured data is: where each slot stands, and where its type. Client values and
// items alike.
struct slot_list {
    std::uint32_t  count;
    std::uint32_t  stride;       // bytes from slot to slot
    std::uint32_t  first;        // offset of the first slot
    kt_data_type_t element_type; // KT_UNKNOWN: each entry tells its own, 8 bytes ahead of its slot

    [[nodiscard]] std::uint64_t length() const { return list_head_length + std::uint64_t{count} * stride; }
    [[nodiscard]] std::size_t   slot(std::uint32_t i) const { return first + std::size_t{i} * stride; }

    template <word_order Order = word_order::local>
    [[nodiscard]] kt_data_type_t type(const std::byte * p_list, std::uint32_t i) const
    {
        return element_type != KT_UNKNOWN ? element_type : load<std::uint32_t, Order>(p_list + slot(i) - 8);
    }
};
static_assert(offsetof(kt_array_t, elements) == list_head_length && sizeof(kt_value_t) == 8);
static_assert(offsetof(kt_structured_data_t, elements) == list_head_length);
static_assert(sizeof(kt_structured_data_element_t) == 16 && offsetof(kt_structured_data_element_t, value) == 8 &&
              offsetof(kt_structured_data_element_t, data_type) == 0);

template <word_order Order = word_order::local>
[[nodiscard]] slot_list slot_list_of(kt_data_type_t type, const std::byte * p_list)
{
    const std::uint32_t count = load<std::uint32_t, Order>(p_list);
    if (type == KT_SD_PTR)
        return {count, sizeof(kt_structured_data_element_t), list_head_length + 8, KT_UNKNOWN};
    return {count, sizeof(kt_value_t), list_head_length, type - array_type_distance};
}

// Copies the head of a list and all of its slots that hold scalars, in one go where they all do. Says whether any slot
// is left: those of indirect types, for the caller to fill.
[[nodiscard]] inline bool copy_scalar_slots(const slot_list & list, std::byte * p_to, const std::byte * p_from)
{
    store(p_to, list.count);
    store(p_to + 4, std::uint32_t{0});
    switch (form_of(list.element_type)) {
    case item_form::word32:
        copy_word32_slots(p_to + list_head_length, p_from + list_head_length, list.count);
        return false;
    case item_form::word64:
        std::memcpy(p_to + list_head_length, p_from + list_head_length, std::size_t{list.count} * 8);
        return false;
    case item_form::none:
    case item_form::string:
    case item_form::binary:
    case item_form::handle:
    case item_form::structured:
    case item_form::sbs:
    case item_form::array:
        break;
    }
    if (list.element_type != KT_UNKNOWN)
        return list.count != 0;

    bool any_left = false;
    for (std::uint32_t i = 0; i < list.count; ++i) {
        const std::size_t    slot = list.slot(i);
        const kt_data_type_t type = list.type(p_from, i);
        store(p_to + slot - 8, type);
        store(p_to + slot - 4, std::uint32_t{0});
        if (const item_form form = form_of(type); is_scalar(form))
            copy_scalar(form, p_to + slot, p_from + slot);
        else
            any_left = true;
    }
    return any_left;
}

} // namespace kt_pmsg_i
