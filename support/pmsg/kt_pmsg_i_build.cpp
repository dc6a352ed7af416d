// SPDX-License-Identifier: MIT
// kt_pmsg_i_build: makes stored values from client values, and tells how long their items will be.
//
// Layer: value library. Calls the string conversion of the utility library; called by everything that stores rows,
// default values and packed tables.
// Always holds: measuring and writing go through a value in the same order, so an item is exactly as long as measured;
// every byte of it is written, whatever the room held before.
// Locking: none. A value must not change while a call reads it.
// Failure: measuring finds all failures before the first byte is written.
#include "kt_pmsg_i_text.h"

namespace kt_pmsg_i
{

namespace
{

constexpr std::uint64_t longest_item = 0xFFFFFFFF;

// The empty SBS: a length of 0, and no fields.
constexpr std::byte empty_sbs[length_word_length] = {};

const std::byte * empty_value(item_form form)
{
    switch (form) {
    case item_form::string:
        return reinterpret_cast<const std::byte *>(ku_ptr_empty_char_1);
    case item_form::binary:
        return reinterpret_cast<const std::byte *>(ku_ptr_empty_binary_1);
    case item_form::handle:
        return reinterpret_cast<const std::byte *>(ku_ptr_invld_rsrc_hndl_1);
    case item_form::structured:
        return reinterpret_cast<const std::byte *>(ku_ptr_empty_sd_1);
    case item_form::array:
        return reinterpret_cast<const std::byte *>(ku_ptr_empty_array_1);
    case item_form::sbs:
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
        break;
    }
    return empty_sbs;
}

// The client's record that a slot of an indirect type points to.
const std::byte * client_record(item_form form, const std::byte * p_slot)
{
    const std::byte * p_record;
    std::memcpy(&p_record, p_slot, sizeof p_record);
    return p_record != nullptr ? p_record : empty_value(form);
}

struct measuring {
    text_conversion * p_text;
    std::uint64_t     limit;      // bytes that may be taken
    std::uint64_t     length = 0; // bytes taken so far; passing the limit ends the walk

    [[nodiscard]] kt_int32_t take(std::uint64_t bytes)
    {
        length += bytes;
        return length <= limit ? 0 : KT_PMSG_E_NO_ROOM;
    }
};

[[nodiscard]] kt_int32_t measure_item(kt_data_type_t type, const std::byte * p_record, unsigned level,
                                      measuring & total);

[[nodiscard]] kt_int32_t measure_list(kt_data_type_t type, const std::byte * p_record, unsigned level,
                                      measuring & total)
{
    const slot_list list = slot_list_of(type, p_record);
    if (const kt_int32_t rc = total.take(list.length()); rc != 0)
        return rc;
    if (is_scalar(form_of(list.element_type)))
        return 0;

    for (std::uint32_t i = 0; i < list.count; ++i) {
        const kt_data_type_t element_type = list.type(p_record, i);
        const item_form      form         = form_of(element_type);
        if (is_scalar(form))
            continue;
        const std::byte * const p_element = client_record(form, p_record + list.slot(i));
        if (const kt_int32_t rc = measure_item(element_type, p_element, level + 1, total); rc != 0)
            return rc;
    }
    return 0;
}

// level is 1 for the item that the slot itself names.
kt_int32_t measure_item(kt_data_type_t type, const std::byte * p_record, unsigned level, measuring & total)
{
    // Also what ends the walk of a value that contains itself.
    if (level > KT_PMSG_MAXIMUM_NESTING)
        return KT_PMSG_E_DAMAGED;
    switch (form_of(type)) {
    case item_form::string: {
        std::uint64_t length = std::strlen(reinterpret_cast<const char *>(p_record)) + 1;
        if (const kt_int32_t rc = total.p_text->measure(p_record, length, &length); rc != 0)
            return rc;
        return total.take(length);
    }
    case item_form::binary:
        return total.take(std::uint64_t{length_word_length} + load_u32(p_record));
    case item_form::handle:
        return total.take(handle_length);
    case item_form::sbs:
        if (load<kt_uint32_t>(p_record) > INT32_MAX)
            return KT_PMSG_E_DAMAGED;
        return total.take(std::uint64_t{length_word_length} + load_u32(p_record));
    case item_form::structured:
    case item_form::array:
        return measure_list(type, p_record, level, total);
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
        break;
    }
    return KT_PMSG_E_UNSUPPORTED_TYPE;
}

[[nodiscard]] std::byte * write_item(kt_data_type_t type, const std::byte * p_record, std::byte * p_item,
                                     text_conversion & text);

[[nodiscard]] std::byte * write_list(kt_data_type_t type, const std::byte * p_record, std::byte * p_item,
                                     text_conversion & text)
{
    const slot_list list  = slot_list_of(type, p_record);
    std::byte *     p_end = p_item + list.length();
    if (!copy_scalar_slots(list, p_item, p_record))
        return p_end;

    for (std::uint32_t i = 0; i < list.count; ++i) {
        const kt_data_type_t element_type = list.type(p_record, i);
        const item_form      form         = form_of(element_type);
        if (is_scalar(form))
            continue;
        const std::byte * const p_element = client_record(form, p_record + list.slot(i));
        std::byte * const       p_start   = p_end;
        p_end                             = write_item(element_type, p_element, p_start, text);
        store_anchor(p_item + list.slot(i), static_cast<std::uint64_t>(p_start - p_item),
                     static_cast<std::uint64_t>(p_end - p_start));
    }
    return p_end;
}

// Writes the item of a measured value and returns its end.
std::byte * write_item(kt_data_type_t type, const std::byte * p_record, std::byte * p_item, text_conversion & text)
{
    switch (form_of(type)) {
    case item_form::string:
        return p_item + text.take(p_item, p_record);
    case item_form::binary:
    case item_form::sbs: {
        const std::size_t length = std::size_t{length_word_length} + load_u32(p_record);
        std::memcpy(p_item, p_record, length);
        return p_item + length;
    }
    case item_form::handle:
        std::memcpy(p_item, p_record, handle_length);
        return p_item + handle_length;
    case item_form::structured:
    case item_form::array:
        return write_list(type, p_record, p_item, text);
    case item_form::none:
    case item_form::word32:
    case item_form::word64:
        break;
    }
    return p_item;
}

// Writes the item of a value of that type into room of so many bytes, and tells its length.
[[nodiscard]] kt_int32_t build_item(kt_data_type_t type, const std::byte * p_record, std::byte * p_item,
                                    std::uint64_t room, text_conversion & text, std::uint64_t * p_length)
{
    measuring total{&text, room};
    if (const kt_int32_t rc = measure_item(type, p_record, 1, total); rc != 0)
        return rc;
    // Nothing below fails.
    static_cast<void>(write_item(type, p_record, p_item, text));
    *p_length = total.length;
    return 0;
}

// The same for a string that goes through unchanged, which most items are.
[[nodiscard]] kt_int32_t build_plain_string(const std::byte * p_string, std::byte * p_item, std::uint64_t room,
                                            std::uint64_t * p_length)
{
    const std::size_t length = std::strlen(reinterpret_cast<const char *>(p_string)) + 1;
    if (length > room)
        return KT_PMSG_E_NO_ROOM;
    std::memcpy(p_item, p_string, length);
    *p_length = length;
    return 0;
}

} // namespace

} // namespace kt_pmsg_i

using namespace kt_pmsg_i;

extern "C" kt_int32_t kt_pmsg_build_conv_protocol_value_1(ku_iconv_t * p_string_conversion_handle,
                                                          kt_uint32_t /* reserved */, kt_data_type_t type,
                                                          const kt_value_t * p_value, void * p_slot,
                                                          void * p_indirect_data, kt_pmsg_len_t indirect_data_capacity,
                                                          kt_pmsg_off_t * p_running_offset)
{
    if (p_value == nullptr || p_slot == nullptr)
        return KT_PMSG_E_DAMAGED;
    const auto * const p_client = reinterpret_cast<const std::byte *>(p_value);
    auto * const       p_target = static_cast<std::byte *>(p_slot);
    const item_form    form     = form_of(type);
    if (is_scalar(form)) {
        copy_scalar(form, p_target, p_client);
        return 0;
    }
    if (form == item_form::none)
        return KT_PMSG_E_UNSUPPORTED_TYPE;
    if (p_running_offset == nullptr)
        return KT_PMSG_E_DAMAGED;
    const kt_pmsg_off_t offset = *p_running_offset;
    if (p_indirect_data == nullptr || offset > indirect_data_capacity)
        return KT_PMSG_E_NO_ROOM;

    const std::byte * const p_record = client_record(form, p_client);
    text_conversion         text(p_string_conversion_handle);
    std::byte * const       p_item = static_cast<std::byte *>(p_indirect_data) + offset;
    const std::uint64_t     room   = indirect_data_capacity - offset;
    std::uint64_t           length = 0;
    const kt_int32_t        rc     = form == item_form::string && text.is_identity()
                                         ? build_plain_string(p_record, p_item, room, &length)
                                         : build_item(type, p_record, p_item, room, text, &length);
    if (rc != 0)
        return rc;
    store_anchor(p_target, offset, length);
    *p_running_offset = offset + static_cast<kt_pmsg_off_t>(length);
    return 0;
}

extern "C" kt_int32_t kt_pmsg_size_conv_protocol_value_1(kt_uint32_t /* reserved1 */, kt_uint32_t /* reserved2 */,
                                                         kt_data_type_t type, const kt_value_t * p_value,
                                                         kt_pmsg_len_t * p_size)
{
    if (p_value == nullptr || p_size == nullptr)
        return KT_PMSG_E_DAMAGED;
    const item_form form = form_of(type);
    if (is_scalar(form)) {
        *p_size = 0;
        return 0;
    }
    if (form == item_form::none)
        return KT_PMSG_E_UNSUPPORTED_TYPE;

    text_conversion         text(nullptr);
    measuring               total{&text, longest_item};
    const std::byte * const p_record = client_record(form, reinterpret_cast<const std::byte *>(p_value));
    if (const kt_int32_t rc = measure_item(type, p_record, 1, total); rc != 0)
        return rc;
    *p_size = static_cast<kt_pmsg_len_t>(total.length);
    return 0;
}
