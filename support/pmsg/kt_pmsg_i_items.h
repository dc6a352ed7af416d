// SPDX-License-Identifier: MIT
// kt_pmsg_i_items: the check of a stored item, down through everything that it holds.
//
// Items come from files and from other machines, so nothing in them is believed. A checked item keeps these rules, and
// what walks it afterwards needs no test of its own:
// - each item lies inside its enclosing item, behind that one's head and slots;
// - the items of one array or structured data stand in the order of their slots and don't overlap, so a walk costs in
//   proportion to the bytes, whatever the anchors say, and a conversion in place touches each word once;
// - heads, counts and inner lengths fit in their item, strings end in it, and no item lies deeper than
//   KT_PMSG_MAXIMUM_NESTING.
#pragma once

#include <algorithm>

#include "kt_pmsg_i_text.h"

namespace kt_pmsg_i
{

// Where things come to lie in the one block that a client value is read into. Measuring and filling place the same
// things in the same order, so they come to lie in the same places.
class client_block
{
  public:
    [[nodiscard]] std::uint64_t place(std::uint64_t bytes, std::uint64_t alignment)
    {
        const std::uint64_t start = (end_ + alignment - 1) & ~(alignment - 1);
        end_                      = start + bytes;
        return start;
    }
    [[nodiscard]] std::uint64_t length() const { return end_; }

  private:
    std::uint64_t end_ = 0;
};

// Bytes that a client record takes: never less than its declared type, so that it may be copied as one.
[[nodiscard]] inline std::uint64_t client_length(item_form form, std::uint64_t stored_length)
{
    switch (form) {
    case item_form::binary:
        return std::max<std::uint64_t>(stored_length, sizeof(kt_binary_t));
    case item_form::sbs:
        return std::max<std::uint64_t>(stored_length, sizeof(kt_sbs_t));
    case item_form::structured:
        return std::max<std::uint64_t>(stored_length, sizeof(kt_structured_data_t));
    case item_form::array:
        return std::max<std::uint64_t>(stored_length, sizeof(kt_array_t));
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
    case item_form::string:
    case item_form::handle:
        break;
    }
    return stored_length;
}

[[nodiscard]] constexpr std::uint64_t client_alignment(item_form form)
{
    switch (form) {
    case item_form::binary:
    case item_form::handle:
    case item_form::sbs:
        return alignof(kt_resource_handle_t);
    case item_form::structured:
    case item_form::array:
        return alignof(kt_value_t);
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
    case item_form::string:
        break;
    }
    return 1;
}
static_assert(alignof(kt_binary_t) == 4 && alignof(kt_sbs_t) == 4 && alignof(kt_structured_data_t) == 8 &&
              alignof(kt_array_t) == 8);

// Measures the client value of an item that is being checked.
struct client_measure {
    text_conversion * p_text;
    client_block      block;
};

struct stored_item {
    const std::byte * p_bytes;
    std::uint32_t     length;
};

// Checks an item whose words stand in the order told, and all that it holds. With p_measure it finds the room that the
// client value takes and converts the strings; that is for items in local order only. level is 1 for the item that the
// slot itself names.
template <word_order Order>
[[nodiscard]] kt_int32_t check_item(kt_data_type_t type, stored_item item, unsigned level, client_measure * p_measure);

// The bytes that an item takes by its own account, without the items inside it. Of a damaged item that is more than its
// length.
template <word_order Order> [[nodiscard]] std::uint64_t own_length(kt_data_type_t type, stored_item item)
{
    const std::uint64_t damaged = std::uint64_t{item.length} + 1;
    switch (form_of(type)) {
    case item_form::string: {
        const void * const p_terminator = std::memchr(item.p_bytes, 0, item.length);
        if (p_terminator == nullptr)
            return damaged;
        return static_cast<std::uint64_t>(static_cast<const std::byte *>(p_terminator) - item.p_bytes) + 1;
    }
    case item_form::binary:
        if (item.length < length_word_length)
            return damaged;
        return length_word_length + std::uint64_t{load<std::uint32_t, Order>(item.p_bytes)};
    case item_form::sbs: {
        if (item.length < length_word_length)
            return damaged;
        const std::uint32_t length = load<std::uint32_t, Order>(item.p_bytes);
        return length <= INT32_MAX ? length_word_length + std::uint64_t{length} : damaged;
    }
    case item_form::handle:
        return handle_length;
    case item_form::structured:
    case item_form::array:
        return item.length < list_head_length ? damaged : slot_list_of<Order>(type, item.p_bytes).length();
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
        break;
    }
    return damaged;
}

// Checks the slots of an array or structured data whose own length is known to fit.
template <word_order Order>
[[nodiscard]] kt_int32_t check_slots(kt_data_type_t type, stored_item item, unsigned level, client_measure * p_measure)
{
    const slot_list list = slot_list_of<Order>(type, item.p_bytes);
    if (is_scalar(form_of(list.element_type)))
        return 0;

    std::uint64_t next_free = list.length();
    for (std::uint32_t i = 0; i < list.count; ++i) {
        const kt_data_type_t element_type = list.template type<Order>(item.p_bytes, i);
        const item_form      form         = form_of(element_type);
        if (is_scalar(form))
            continue;
        if (form == item_form::none)
            return KT_PMSG_E_UNSUPPORTED_TYPE;
        const kt_pmsg_value_anchor_t anchor = load_anchor<Order>(item.p_bytes + list.slot(i));
        if (anchor.offset < next_free || std::uint64_t{anchor.offset} + anchor.length > item.length)
            return KT_PMSG_E_DAMAGED;
        next_free = std::uint64_t{anchor.offset} + anchor.length;

        const stored_item element = {item.p_bytes + anchor.offset, anchor.length};
        if (const kt_int32_t rc = check_item<Order>(element_type, element, level + 1, p_measure); rc != 0)
            return rc;
    }
    return 0;
}

template <word_order Order>
kt_int32_t check_item(kt_data_type_t type, stored_item item, unsigned level, client_measure * p_measure)
{
    const item_form form   = form_of(type);
    std::uint64_t   length = own_length<Order>(type, item);
    if (level > KT_PMSG_MAXIMUM_NESTING || length > item.length)
        return KT_PMSG_E_DAMAGED;
    if (p_measure != nullptr) {
        if (form == item_form::string)
            if (const kt_int32_t rc = p_measure->p_text->measure(item.p_bytes, length, &length); rc != 0)
                return rc;
        static_cast<void>(p_measure->block.place(client_length(form, length), client_alignment(form)));
    }
    if (form != item_form::structured && form != item_form::array)
        return 0;
    return check_slots<Order>(type, item, level, p_measure);
}

// The item that a slot names, if it lies inside the bound.
template <word_order Order>
[[nodiscard]] bool item_of_slot(const std::byte * p_slot, const void * p_indirect_data, kt_pmsg_len_t bound,
                                stored_item * p_item)
{
    const kt_pmsg_value_anchor_t anchor = load_anchor<Order>(p_slot);
    if (p_indirect_data == nullptr || std::uint64_t{anchor.offset} + anchor.length > bound)
        return false;
    *p_item = {static_cast<const std::byte *>(p_indirect_data) + anchor.offset, anchor.length};
    return true;
}

} // namespace kt_pmsg_i
