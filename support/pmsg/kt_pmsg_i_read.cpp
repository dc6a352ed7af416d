// SPDX-License-Identifier: MIT
// kt_pmsg_i_read: makes client values from stored values.
//
// Layer: value library. Calls the string conversion of the utility library; called by everything that hands out values
// of rows, and by unpacking.
// Always holds: an item is checked whole before a byte of it is copied; a client value is one block that shares nothing
// with the item, aligned for the client's types.
// Locking: none. An item must not change while a call reads it.
// Failure: the client's value is untouched, and nothing stays allocated.
#include "kt_pmsg_i_items.h"

namespace kt_pmsg_i
{

namespace
{

struct filling {
    text_conversion * p_text;
    std::byte *       p_block;
    client_block      block;
};

std::byte * fill_item(kt_data_type_t type, const std::byte * p_item, filling & to);

void fill_slots(kt_data_type_t type, const std::byte * p_item, std::byte * p_record, filling & to)
{
    const slot_list list = slot_list_of(type, p_item);
    if (!copy_scalar_slots(list, p_record, p_item))
        return;
    for (std::uint32_t i = 0; i < list.count; ++i) {
        const kt_data_type_t element_type = list.type(p_item, i);
        if (is_scalar(form_of(element_type)))
            continue;
        const kt_pmsg_value_anchor_t anchor    = load_anchor(p_item + list.slot(i));
        std::byte * const            p_element = fill_item(element_type, p_item + anchor.offset, to);
        std::memcpy(p_record + list.slot(i), &p_element, sizeof p_element);
    }
}

// Places a record whose stored length is told, copies that many bytes of the item (all of them but the slots of a list)
// and clears what the client's type has beyond them.
std::byte * fill_bytes(item_form form, const std::byte * p_item, std::uint64_t length, filling & to)
{
    const std::uint64_t room     = client_length(form, length);
    std::byte * const   p_record = to.p_block + to.block.place(room, client_alignment(form));
    std::memcpy(p_record, p_item, length);
    std::memset(p_record + length, 0, room - length);
    return p_record;
}

// Copies a checked item into the block and returns the record's address.
std::byte * fill_item(kt_data_type_t type, const std::byte * p_item, filling & to)
{
    const item_form form = form_of(type);
    switch (form) {
    case item_form::string: {
        std::byte * const p_text = to.p_block + to.block.length();
        static_cast<void>(to.block.place(to.p_text->take(p_text, p_item), client_alignment(form)));
        return p_text;
    }
    case item_form::binary:
    case item_form::sbs:
        return fill_bytes(form, p_item, std::uint64_t{length_word_length} + load_u32(p_item), to);
    case item_form::handle:
        return fill_bytes(form, p_item, handle_length, to);
    case item_form::structured:
    case item_form::array: {
        const std::uint64_t length   = slot_list_of(type, p_item).length();
        const std::uint64_t room     = client_length(form, length);
        std::byte * const   p_record = to.p_block + to.block.place(room, client_alignment(form));
        std::memset(p_record + length, 0, room - length);
        fill_slots(type, p_item, p_record, to);
        return p_record;
    }
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
        break;
    }
    return nullptr;
}

void store_client_pointer(kt_value_t * p_value, const void * p_record)
{
    std::memcpy(p_value, &p_record, sizeof p_record);
}

// The most frequent indirect value by far, so it takes the short way.
[[nodiscard]] kt_int32_t read_string(stored_item item, const text_conversion & text, kt_value_t * p_value)
{
    std::uint64_t length = own_length<word_order::local>(KT_CHAR_PTR, item);
    if (length > item.length)
        return KT_PMSG_E_DAMAGED;

    char * p_text = nullptr;
    if (!text.is_identity()) {
        const auto * const p_string = reinterpret_cast<const char *>(item.p_bytes);
        if (const kt_int32_t rc = convert_text(text.handle(), p_string, &p_text, &length); rc != 0)
            return rc;
    } else {
        p_text = static_cast<char *>(std::malloc(length));
        if (p_text == nullptr)
            return KT_PMSG_E_NO_MEMORY;
        std::memcpy(p_text, item.p_bytes, length);
    }
    store_client_pointer(p_value, p_text);
    return 0;
}

} // namespace

} // namespace kt_pmsg_i

using namespace kt_pmsg_i;

extern "C" kt_int32_t kt_pmsg_build_conv_packed_client_value_1(ku_iconv_t * p_string_conversion_handle,
                                                               kt_uint32_t /* reserved */, kt_data_type_t type,
                                                               kt_value_t * p_value, const void * p_slot,
                                                               const void *  p_indirect_data,
                                                               kt_pmsg_len_t indirect_data_bound)
{
    if (p_value == nullptr || p_slot == nullptr)
        return KT_PMSG_E_DAMAGED;
    const auto * const p_stored = static_cast<const std::byte *>(p_slot);
    const item_form    form     = form_of(type);
    if (is_scalar(form)) {
        copy_scalar(form, reinterpret_cast<std::byte *>(p_value), p_stored);
        return 0;
    }
    if (form == item_form::none)
        return KT_PMSG_E_UNSUPPORTED_TYPE;

    stored_item item;
    if (!item_of_slot<word_order::local>(p_stored, p_indirect_data, indirect_data_bound, &item))
        return KT_PMSG_E_DAMAGED;
    text_conversion text(p_string_conversion_handle);
    if (form == item_form::string)
        return read_string(item, text, p_value);

    client_measure measure = {&text, {}};
    if (const kt_int32_t rc = check_item<word_order::local>(type, item, 1, &measure); rc != 0)
        return rc;
    auto * const p_block = static_cast<std::byte *>(std::malloc(measure.block.length()));
    if (p_block == nullptr)
        return KT_PMSG_E_NO_MEMORY;

    // Nothing below fails.
    filling to = {&text, p_block, {}};
    store_client_pointer(p_value, fill_item(type, item.p_bytes, to));
    return 0;
}
