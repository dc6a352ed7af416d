// SPDX-License-Identifier: MIT
// kt_pmsg_i_convert: puts stored values that another machine wrote into local byte order, in place.
//
// Layer: value library. Called by the conversion of packed tables.
// Always holds: a slot and its item are checked whole before the first word is reversed; the check leaves no overlaps,
// so each word is reversed exactly once.
// Locking: none. A buffer belongs to one caller at a time.
// Failure: nothing has changed.
#include "kt_pmsg_i_convert.h"

#include <bit>

#include "kt_pmsg_i_items.h"

namespace kt_pmsg_i
{

namespace
{

constexpr std::uint8_t known_arch_props = KT_PMSG_ARCH_BIG_ENDIAN | KT_PMSG_ARCH_64_BIT;
constexpr std::uint8_t local_arch_props =
    KT_PMSG_ARCH_64_BIT | (std::endian::native == std::endian::big ? KT_PMSG_ARCH_BIG_ENDIAN : 0);
static_assert(std::endian::native == std::endian::big || std::endian::native == std::endian::little);

void reverse_scalar(item_form form, std::byte * p_slot)
{
    if (form == item_form::word32)
        reverse_in_place<std::uint32_t>(p_slot); // the other half of the slot is zero
    else
        reverse_in_place<std::uint64_t>(p_slot);
}

// ---- SBS -----------------------------------------------------------------------------------------------------------

constexpr std::uint32_t field_head_length = offsetof(kt_sbs_field_t, field_data);
static_assert(field_head_length == 4 && offsetof(kt_sbs_field_t, field_dtype) == 2);

template <word_order Order> [[nodiscard]] std::uint32_t field_length(const std::byte * p_field)
{
    return field_head_length + load<std::uint16_t, Order>(p_field);
}

// Whether the bytes are fields from the first to the last.
template <word_order Order> [[nodiscard]] bool are_fields(const std::byte * p_fields, std::uint32_t length)
{
    std::uint32_t left = length;
    while (left >= field_head_length) {
        const std::uint32_t taken = field_length<Order>(p_fields + (length - left));
        if (taken - field_head_length > INT16_MAX || taken > left)
            return false;
        left -= taken;
    }
    return left == 0;
}

void reverse_field_data(kt_data_type_t type, std::byte * p_data, std::uint32_t length)
{
    const item_form form = form_of(type);
    if (form == item_form::word32 && length == 4)
        reverse_in_place<std::uint32_t>(p_data);
    else if (form == item_form::word64 && length == 8)
        reverse_in_place<std::uint64_t>(p_data);
    else if (form == item_form::handle && length == handle_length)
        for (std::uint32_t i = 0; i < handle_length; i += 4)
            reverse_in_place<std::uint32_t>(p_data + i);
}

// Fields that fill the SBS exactly are reversed: their lengths, and their data where a field is one number or a
// resource handle. An SBS of other content is its user's own, and goes through as bytes.
template <word_order Order> void reverse_fields(std::byte * p_fields, std::uint32_t length)
{
    if (!are_fields<Order>(p_fields, length))
        return;
    for (std::uint32_t done = 0; done < length;) {
        std::byte * const   p_field = p_fields + done;
        const std::uint32_t taken   = field_length<Order>(p_field);
        const auto          type    = std::to_integer<kt_data_type_t>(p_field[offsetof(kt_sbs_field_t, field_dtype)]);
        reverse_field_data(type, p_field + field_head_length, taken - field_head_length);
        reverse_in_place<std::uint16_t>(p_field);
        done += taken;
    }
}

// ---- Items ---------------------------------------------------------------------------------------------------------

template <word_order Order> void reverse_item(kt_data_type_t type, std::byte * p_item);

template <word_order Order> void reverse_slot(kt_data_type_t type, std::byte * p_slot, std::byte * p_enclosing)
{
    const item_form form = form_of(type);
    if (is_scalar(form)) {
        reverse_scalar(form, p_slot);
        return;
    }
    reverse_item<Order>(type, p_enclosing + load_anchor<Order>(p_slot).offset);
    reverse_in_place<std::uint32_t>(p_slot);
    reverse_in_place<std::uint32_t>(p_slot + 4);
}

template <word_order Order> void reverse_list(kt_data_type_t type, std::byte * p_item)
{
    const slot_list list = slot_list_of<Order>(type, p_item);
    if (const item_form form = form_of(list.element_type); is_scalar(form)) {
        for (std::uint32_t i = 0; i < list.count; ++i)
            reverse_scalar(form, p_item + list.slot(i));
    } else {
        for (std::uint32_t i = 0; i < list.count; ++i) {
            const kt_data_type_t element_type = list.type<Order>(p_item, i);
            if (list.element_type == KT_UNKNOWN)
                reverse_in_place<std::uint32_t>(p_item + list.slot(i) - 8);
            reverse_slot<Order>(element_type, p_item + list.slot(i), p_item);
        }
    }
    reverse_in_place<std::uint32_t>(p_item);
}

// Reverses a checked item, with everything that it holds.
template <word_order Order> void reverse_item(kt_data_type_t type, std::byte * p_item)
{
    switch (form_of(type)) {
    case item_form::binary:
        reverse_in_place<std::uint32_t>(p_item);
        break;
    case item_form::handle:
        for (std::uint32_t i = 0; i < handle_length; i += 4)
            reverse_in_place<std::uint32_t>(p_item + i);
        break;
    case item_form::sbs:
        reverse_fields<Order>(p_item + length_word_length, load<std::uint32_t, Order>(p_item));
        reverse_in_place<std::uint32_t>(p_item);
        break;
    case item_form::structured:
    case item_form::array:
        reverse_list<Order>(type, p_item);
        break;
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
    case item_form::string:
        break;
    }
}

template <word_order Order>
[[nodiscard]] kt_int32_t reverse_checked(std::byte * p_slot, kt_data_type_t type, std::byte * p_indirect_data,
                                         kt_pmsg_len_t bound)
{
    const item_form form = form_of(type);
    if (form == item_form::none)
        return KT_PMSG_E_UNSUPPORTED_TYPE;
    if (!is_scalar(form)) {
        stored_item item;
        if (!item_of_slot<Order>(p_slot, p_indirect_data, bound, &item))
            return KT_PMSG_E_DAMAGED;
        if (const kt_int32_t rc = check_item<Order>(type, item, 1, nullptr); rc != 0)
            return rc;
    }
    reverse_slot<Order>(type, p_slot, p_indirect_data);
    return 0;
}

} // namespace

kt_int32_t reverse_value(word_order order, void * p_slot, kt_data_type_t type, void * p_indirect_data,
                         kt_pmsg_len_t indirect_data_bound)
{
    if (p_slot == nullptr)
        return KT_PMSG_E_DAMAGED;
    auto * const p_words    = static_cast<std::byte *>(p_slot);
    auto * const p_indirect = static_cast<std::byte *>(p_indirect_data);
    if (order == word_order::foreign)
        return reverse_checked<word_order::foreign>(p_words, type, p_indirect, indirect_data_bound);
    return reverse_checked<word_order::local>(p_words, type, p_indirect, indirect_data_bound);
}

} // namespace kt_pmsg_i

using namespace kt_pmsg_i;

extern "C" kt_int32_t kt_pmsg_cnv_required_1(kt_pmsg_header_t * p_header, kt_int32_t * p_required)
{
    if (p_header == nullptr || p_required == nullptr)
        return KT_PMSG_E_DAMAGED;
    // A message may lie at any address.
    kt_pmsg_header_t header;
    std::memcpy(&header, p_header, sizeof header);
    if (header.kt_pmsg_version != 0 || (header.kt_pmsg_arch_props & ~known_arch_props) != 0)
        return KT_PMSG_E_DAMAGED;

    const bool differs = ((header.kt_pmsg_arch_props ^ local_arch_props) & KT_PMSG_ARCH_BIG_ENDIAN) != 0;
    if (differs)
        header.kt_pmsg_length = reversed(header.kt_pmsg_length);
    if (header.kt_pmsg_length < sizeof header)
        return KT_PMSG_E_DAMAGED;
    if (differs) {
        // So that a second call, and whoever gets the message next, finds nothing left to do.
        header.kt_pmsg_arch_props = local_arch_props;
        std::memcpy(p_header, &header, sizeof header);
    }
    *p_required = differs ? 1 : 0;
    return 0;
}

extern "C" kt_int32_t kt_pmsg_convert_pmsg_value_within_1(void * p_slot, kt_data_type_t type, void * p_indirect_data,
                                                          kt_pmsg_len_t indirect_data_bound)
{
    return reverse_value(word_order::foreign, p_slot, type, p_indirect_data, indirect_data_bound);
}

extern "C" kt_int32_t kt_pmsg_convert_pmsg_value_1(void * p_slot, kt_data_type_t type, void * p_indirect_data)
{
    return kt_pmsg_convert_pmsg_value_within_1(p_slot, type, p_indirect_data, no_bound);
}
