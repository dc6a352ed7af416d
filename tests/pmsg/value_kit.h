// SPDX-License-Identifier: MIT
// value_kit: values as the tests write them down, and what they should look like as client values and as items.
//
// The encoder here is written from the description of the item forms, not from the library, and writes either byte
// order. So it stands for the foreign machine in the tests of conversion.
#pragma once

#include <array>
#include <bit>
#include <cstdint>
#include <cstring>
#include <deque>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "kt_pmsg.h"

namespace kt_test
{

using octets = std::vector<std::uint8_t>;

enum class machine { here, other };

// ---- Writing words as a machine would ------------------------------------------------------------------------------

template <class Word> void append(octets & to, Word word, machine order)
{
    std::uint8_t octet[sizeof word];
    std::memcpy(octet, &word, sizeof word);
    for (std::size_t i = 0; i < sizeof word; ++i)
        to.push_back(octet[order == machine::here ? i : sizeof word - 1 - i]);
}

template <class Word> void put(octets & to, std::size_t at, Word word, machine order)
{
    octets octet;
    append(octet, word, order);
    std::copy(octet.begin(), octet.end(), to.begin() + static_cast<std::ptrdiff_t>(at));
}

// ---- A value as a test writes it -----------------------------------------------------------------------------------

struct model {
    kt_data_type_t               type     = KT_UNKNOWN;
    std::uint64_t                number   = 0;  // the bits of a scalar
    std::string                  text     = {}; // of a string; the bytes of a binary
    std::array<std::uint32_t, 5> handle   = {};
    std::vector<model>           elements = {}; // of an array or structured data; the fields of an SBS
    std::int8_t                  sn       = 0;  // of a field of an SBS
    std::string                  name     = {}; // for messages of failed tests
};

inline model a_number(kt_data_type_t type, std::uint64_t bits)
{
    return {.type = type, .number = bits};
}

inline model a_string(std::string text)
{
    return {.type = KT_CHAR_PTR, .text = std::move(text)};
}

inline model a_binary(std::string text)
{
    return {.type = KT_BINARY_PTR, .text = std::move(text)};
}

inline model a_handle(std::uint32_t header, std::uint32_t id1, std::uint32_t id2, std::uint32_t id3, std::uint32_t id4)
{
    return {.type = KT_RSRC_HANDLE_PTR, .handle = {header, id1, id2, id3, id4}};
}

inline model structured(std::vector<model> elements)
{
    return {.type = KT_SD_PTR, .elements = std::move(elements)};
}

inline model an_array(kt_data_type_t type, std::vector<model> elements)
{
    return {.type = type, .elements = std::move(elements)};
}

inline model numbers(kt_data_type_t array_type, const std::vector<std::uint64_t> & bits)
{
    model result{.type = array_type};
    for (const std::uint64_t b : bits)
        result.elements.push_back(a_number(array_type - (KT_INT32_ARRAY - KT_INT32), b));
    return result;
}

// An SBS of fields, or of bytes that are no fields.
inline model an_sbs(std::vector<model> fields)
{
    return {.type = KT_SBS_PTR, .elements = std::move(fields)};
}

inline model an_sbs_of_bytes(std::string text)
{
    return {.type = KT_SBS_PTR, .text = std::move(text)};
}

inline model named(std::string name, model m)
{
    m.name = std::move(name);
    return m;
}

// Structured data in structured data, so many of them.
inline model nested(unsigned levels)
{
    model m = structured({a_number(KT_UINT32, 7)});
    for (unsigned level = 1; level < levels; ++level)
        m = structured({std::move(m)});
    return m;
}

inline bool is_32_bit(kt_data_type_t type)
{
    return type == KT_INT32 || type == KT_UINT32 || type == KT_FLOAT32;
}

inline bool is_64_bit(kt_data_type_t type)
{
    return type == KT_INT64 || type == KT_UINT64 || type == KT_FLOAT64;
}

inline bool is_number(kt_data_type_t type)
{
    return is_32_bit(type) || is_64_bit(type);
}

// ---- The item of a value -------------------------------------------------------------------------------------------

octets item_of(const model & m, machine order);

// The slot of an element: its number, or the anchor of its item, which goes behind what is there.
inline void put_slot(octets & item, std::size_t at, const model & m, machine order)
{
    if (is_32_bit(m.type)) {
        put(item, at, static_cast<std::uint32_t>(m.number), order);
    } else if (is_64_bit(m.type)) {
        put(item, at, m.number, order);
    } else {
        const octets inner = item_of(m, order);
        put(item, at, static_cast<std::uint32_t>(item.size()), order);
        put(item, at + 4, static_cast<std::uint32_t>(inner.size()), order);
        item.insert(item.end(), inner.begin(), inner.end());
    }
}

inline octets fields_of(const model & m, machine order)
{
    octets fields(m.text.begin(), m.text.end());
    for (const model & field : m.elements) {
        octets data(field.text.begin(), field.text.end()); // any bytes, whatever the type says
        if (field.text.empty() && is_32_bit(field.type))
            append(data, static_cast<std::uint32_t>(field.number), order);
        else if (field.text.empty() && is_64_bit(field.type))
            append(data, field.number, order);
        else if (field.type == KT_RSRC_HANDLE_PTR)
            for (const std::uint32_t word : field.handle)
                append(data, word, order);
        append(fields, static_cast<std::uint16_t>(data.size()), order);
        fields.push_back(static_cast<std::uint8_t>(field.type));
        fields.push_back(static_cast<std::uint8_t>(field.sn));
        fields.insert(fields.end(), data.begin(), data.end());
    }
    return fields;
}

inline octets item_of(const model & m, machine order)
{
    octets     item;
    const auto append_counted = [&](const octets & content) {
        append(item, static_cast<std::uint32_t>(content.size()), order);
        item.insert(item.end(), content.begin(), content.end());
    };
    switch (m.type) {
    case KT_CHAR_PTR:
        item.assign(m.text.begin(), m.text.end());
        item.push_back(0);
        return item;
    case KT_BINARY_PTR:
        append_counted(octets(m.text.begin(), m.text.end()));
        return item;
    case KT_SBS_PTR:
        append_counted(fields_of(m, order));
        return item;
    case KT_RSRC_HANDLE_PTR:
        for (const std::uint32_t word : m.handle)
            append(item, word, order);
        return item;
    default:
        break;
    }
    const std::size_t stride = m.type == KT_SD_PTR ? 16 : 8;
    item.resize(8 + stride * m.elements.size());
    put(item, 0, static_cast<std::uint32_t>(m.elements.size()), order);
    for (std::size_t i = 0; i < m.elements.size(); ++i) {
        const std::size_t slot = 8 + stride * (i + 1) - 8;
        if (m.type == KT_SD_PTR)
            put(item, slot - 8, m.elements[i].type, order);
        put_slot(item, slot, m.elements[i], order);
    }
    return item;
}

// ---- The client value ----------------------------------------------------------------------------------------------

// Keeps the records of client values while a test uses them.
class client_values
{
  public:
    kt_value_t make(const model & m)
    {
        kt_value_t value;
        std::memset(&value, 0, sizeof value);
        if (is_32_bit(m.type)) {
            // What a careless client leaves in the other half must not show.
            value.val_uint64 = 0xA5A5A5A5A5A5A5A5;
            value.val_uint32 = static_cast<std::uint32_t>(m.number);
        } else if (is_64_bit(m.type)) {
            value.val_uint64 = m.number;
        } else {
            make_record(m, value);
        }
        return value;
    }

  private:
    template <class Record> Record * room(std::size_t bytes)
    {
        // Exactly as many bytes as the record says that it has, so that sanitizers see a step beyond them.
        kept_.push_back(std::make_unique<std::uint8_t[]>(bytes));
        std::memset(kept_.back().get(), 0xA5, bytes);
        return reinterpret_cast<Record *>(kept_.back().get());
    }

    // Records may be shorter than their types when they are empty, so words are copied in.
    template <class Record> Record * counted(const octets & content)
    {
        auto *     p      = room<std::uint8_t>(4 + content.size());
        const auto length = static_cast<std::uint32_t>(content.size());
        std::memcpy(p, &length, 4);
        if (!content.empty())
            std::memcpy(p + 4, content.data(), content.size());
        return reinterpret_cast<Record *>(p);
    }

    void make_record(const model & m, kt_value_t & value)
    {
        switch (m.type) {
        case KT_CHAR_PTR:
            value.ptr_char = room<char>(m.text.size() + 1);
            std::memcpy(value.ptr_char, m.text.c_str(), m.text.size() + 1);
            return;
        case KT_BINARY_PTR:
            value.ptr_binary = counted<kt_binary_t>(octets(m.text.begin(), m.text.end()));
            return;
        case KT_SBS_PTR:
            value.ptr_sbs = counted<kt_sbs_t>(fields_of(m, machine::here));
            return;
        case KT_RSRC_HANDLE_PTR:
            value.ptr_rsrc_handle = room<kt_resource_handle_t>(sizeof(kt_resource_handle_t));
            std::memcpy(value.ptr_rsrc_handle, m.handle.data(), sizeof(kt_resource_handle_t));
            return;
        default:
            break;
        }
        const std::size_t stride = m.type == KT_SD_PTR ? 16 : 8;
        auto *            p      = room<std::uint8_t>(8 + stride * m.elements.size());
        const auto        count  = static_cast<std::uint32_t>(m.elements.size());
        std::memcpy(p, &count, 4);
        for (std::size_t i = 0; i < m.elements.size(); ++i) {
            const kt_value_t  element = make(m.elements[i]);
            const std::size_t slot    = 8 + stride * (i + 1) - 8;
            if (m.type == KT_SD_PTR)
                std::memcpy(p + slot - 8, &m.elements[i].type, 4);
            std::memcpy(p + slot, &element, 8);
        }
        std::memcpy(&value, &p, sizeof p);
    }

    std::deque<std::unique_ptr<std::uint8_t[]>> kept_;
};

// The value that a client record holds, walked through its pointers as a client would.
inline model model_of(kt_data_type_t type, const kt_value_t & value)
{
    model m{.type = type};
    switch (type) {
    case KT_CHAR_PTR:
        m.text = value.ptr_char;
        return m;
    case KT_BINARY_PTR:
        m.text.assign(reinterpret_cast<const char *>(value.ptr_binary->data), value.ptr_binary->length);
        return m;
    case KT_SBS_PTR:
        m.text.assign(reinterpret_cast<const char *>(&value.ptr_sbs->field1),
                      static_cast<std::size_t>(value.ptr_sbs->length));
        return m;
    case KT_RSRC_HANDLE_PTR:
        std::memcpy(m.handle.data(), value.ptr_rsrc_handle, sizeof(kt_resource_handle_t));
        return m;
    case KT_SD_PTR:
        for (std::uint32_t i = 0; i < value.ptr_sd->element_count; ++i) {
            const kt_structured_data_element_t & element = value.ptr_sd->elements[i];
            m.elements.push_back(model_of(element.data_type, element.value));
        }
        return m;
    default:
        break;
    }
    if (is_number(type)) {
        m.number = is_32_bit(type) ? value.val_uint32 : value.val_uint64;
        return m;
    }
    for (std::uint32_t i = 0; i < value.ptr_array->element_count; ++i)
        m.elements.push_back(model_of(type - (KT_INT32_ARRAY - KT_INT32), value.ptr_array->elements[i]));
    return m;
}

// ---- Stored values -------------------------------------------------------------------------------------------------

// A slot with its area of indirect data, in a block of exactly that length.
struct stored {
    std::array<std::uint8_t, 8> slot{};
    octets                      area;

    bool operator==(const stored &) const = default;
};

// The stored value as a machine would write it, its item standing at the offset.
inline stored stored_of(const model & m, machine order = machine::here, std::uint32_t offset = 0)
{
    stored s;
    octets slot(8);
    if (is_32_bit(m.type)) {
        put(slot, 0, static_cast<std::uint32_t>(m.number), order);
    } else if (is_64_bit(m.type)) {
        put(slot, 0, m.number, order);
    } else {
        const octets item = item_of(m, order);
        put(slot, 0, offset, order);
        put(slot, 4, static_cast<std::uint32_t>(item.size()), order);
        s.area.assign(offset, 0xEE);
        s.area.insert(s.area.end(), item.begin(), item.end());
    }
    std::copy(slot.begin(), slot.end(), s.slot.begin());
    return s;
}

// ---- Samples -------------------------------------------------------------------------------------------------------

// A value of each type, the empty ones, and nestings of all kinds.
inline std::vector<model> samples()
{
    const auto bits32 = [](float f) { return std::uint64_t{std::bit_cast<std::uint32_t>(f)}; };
    const auto bits64 = [](double f) { return std::bit_cast<std::uint64_t>(f); };

    const model sd = structured({a_number(KT_INT32, 0xFFFFFFF9), a_string("abc"), a_number(KT_UINT64, 1ull << 40),
                                 a_binary(std::string("\1\0\2", 3)), a_handle(1, 2, 3, 4, 5)});
    const model field_of_number = {.type = KT_INT32, .number = 0x01020304, .sn = 1};
    const model field_of_double = {.type = KT_FLOAT64, .number = bits64(0.1), .sn = 2};
    const model field_of_text   = {.type = KT_CHAR_PTR, .text = "text", .sn = 3};
    const model field_of_handle = {.type = KT_RSRC_HANDLE_PTR, .handle = {9, 8, 7, 6, 5}, .sn = -4};
    const model field_of_none   = {.type = KT_NONE, .sn = 5};
    const model sbs = an_sbs({field_of_number, field_of_double, field_of_text, field_of_handle, field_of_none});

    return {
        named("int32", a_number(KT_INT32, 0xFFFFFFFE)),
        named("uint32", a_number(KT_UINT32, 0x01020304)),
        named("int64", a_number(KT_INT64, 0x8000000000000001)),
        named("uint64", a_number(KT_UINT64, 0x0102030405060708)),
        named("float32", a_number(KT_FLOAT32, bits32(1.5f))),
        named("float64", a_number(KT_FLOAT64, bits64(-2.25))),
        named("string", a_string("a string")),
        named("empty string", a_string("")),
        named("binary", a_binary(std::string("\0\1\2\xff", 4))),
        named("empty binary", a_binary("")),
        named("handle", a_handle(0x11121314, 0x21222324, 0x31323334, 0x41424344, 0x51525354)),
        named("structured data", sd),
        named("empty structured data", structured({})),
        named("sbs", sbs),
        named("sbs of other bytes", an_sbs_of_bytes("no fields at all")),
        named("empty sbs", an_sbs({})),
        named("int32 array", numbers(KT_INT32_ARRAY, {1, 0xFFFFFFFF, 3})),
        named("uint32 array", numbers(KT_UINT32_ARRAY, {0x01020304, 0})),
        named("int64 array", numbers(KT_INT64_ARRAY, {1, ~0ull})),
        named("uint64 array", numbers(KT_UINT64_ARRAY, {0x0102030405060708})),
        named("float32 array", numbers(KT_FLOAT32_ARRAY, {bits32(0.5f), bits32(-1e30f)})),
        named("float64 array", numbers(KT_FLOAT64_ARRAY, {bits64(0.5), bits64(1e300)})),
        named("empty float64 array", numbers(KT_FLOAT64_ARRAY, {})),
        named("string array", an_array(KT_CHAR_PTR_ARRAY, {a_string("one"), a_string(""), a_string("three")})),
        named("empty string array", an_array(KT_CHAR_PTR_ARRAY, {})),
        named("binary array", an_array(KT_BINARY_PTR_ARRAY, {a_binary("xyz"), a_binary(""), a_binary("12345")})),
        named("handle array", an_array(KT_RSRC_HANDLE_PTR_ARRAY, {a_handle(1, 2, 3, 4, 5), a_handle(6, 7, 8, 9, 10)})),
        named("structured data array", an_array(KT_SD_PTR_ARRAY, {sd, structured({}), structured({a_string("x")})})),
        named("structured data of everything",
              structured({a_number(KT_FLOAT32, bits32(3.0f)), sbs, numbers(KT_INT32_ARRAY, {5, 6}), a_string("s"),
                          an_array(KT_CHAR_PTR_ARRAY, {a_string("in"), a_string("side")}), sd,
                          numbers(KT_FLOAT64_ARRAY, {bits64(7.5)}), a_number(KT_INT64, 12),
                          an_array(KT_SD_PTR_ARRAY, {sd, structured({an_array(KT_SD_PTR_ARRAY, {sd})})}),
                          an_array(KT_BINARY_PTR_ARRAY, {a_binary("b")}), a_binary("last")})),
        named("32 levels", nested(KT_PMSG_MAXIMUM_NESTING)),
    };
}

} // namespace kt_test
