// SPDX-License-Identifier: MIT
// expr_rows: rows of stored values for the tests of the selection language, laid out by hand from the format document.
#pragma once

#include <cstdint>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "kt_ku.h"

namespace kt_test
{

// A value of any type. Scalars lie in `scalar`, strings and binaries in `bytes`, arrays and structures in `elements`.
struct stored_value {
    kt_data_type_t            type   = KT_UNKNOWN;
    std::uint64_t             scalar = 0; // the slot's bits
    std::string               bytes;
    std::vector<stored_value> elements;
    std::vector<std::string>  field_names; // of structured data
};

template <class T> stored_value scalar_value(kt_data_type_t type, T v)
{
    stored_value result;
    result.type = type;
    std::memcpy(&result.scalar, &v, sizeof v);
    return result;
}
inline stored_value i32(std::int32_t v)
{
    return scalar_value(KT_INT32, v);
}
inline stored_value u32(std::uint32_t v)
{
    return scalar_value(KT_UINT32, v);
}
inline stored_value i64(std::int64_t v)
{
    return scalar_value(KT_INT64, v);
}
inline stored_value u64(std::uint64_t v)
{
    return scalar_value(KT_UINT64, v);
}
inline stored_value f32(float v)
{
    return scalar_value(KT_FLOAT32, v);
}
inline stored_value f64(double v)
{
    return scalar_value(KT_FLOAT64, v);
}
inline stored_value bytes_value(kt_data_type_t type, std::string v)
{
    stored_value result;
    result.type  = type;
    result.bytes = std::move(v);
    return result;
}
inline stored_value str(std::string v)
{
    return bytes_value(KT_CHAR_PTR, std::move(v));
}
inline stored_value bin(std::string v)
{
    return bytes_value(KT_BINARY_PTR, std::move(v));
}
inline stored_value handle(const kt_resource_handle_t & v)
{
    return bytes_value(KT_RSRC_HANDLE_PTR, std::string(reinterpret_cast<const char *>(&v), sizeof v));
}
inline stored_value array(kt_data_type_t array_type, std::vector<stored_value> elements)
{
    stored_value result;
    result.type     = array_type;
    result.elements = std::move(elements);
    return result;
}
inline stored_value structure(std::vector<std::pair<std::string, stored_value>> fields)
{
    stored_value result;
    result.type = KT_SD_PTR;
    for (auto & [name, value] : fields) {
        result.field_names.push_back(name);
        result.elements.push_back(value);
    }
    return result;
}

inline void append_word(std::string & to, std::uint32_t word)
{
    to.append(reinterpret_cast<const char *>(&word), sizeof word);
}

std::string item_of(const stored_value & value);

// The slot of a value whose item, if it has one, goes to the end of `items`; offsets count from `items_at` before it.
inline std::string slot_of(const stored_value & value, std::size_t items_at, std::string & items)
{
    std::string slot;
    if (value.type < KT_CHAR_PTR) {
        slot.assign(reinterpret_cast<const char *>(&value.scalar), 8);
        return slot;
    }
    const std::string item = item_of(value);
    append_word(slot, static_cast<std::uint32_t>(items_at + items.size()));
    append_word(slot, static_cast<std::uint32_t>(item.size()));
    items += item;
    return slot;
}

inline std::string item_of(const stored_value & value)
{
    std::string item, items;
    switch (value.type) {
    case KT_CHAR_PTR:
        return value.bytes + '\0';
    case KT_BINARY_PTR:
        append_word(item, static_cast<std::uint32_t>(value.bytes.size()));
        return item + value.bytes;
    case KT_RSRC_HANDLE_PTR:
        return value.bytes;
    case KT_SBS_PTR:
        append_word(item, 0);
        return item;
    default:
        break;
    }
    const bool        structured = value.type == KT_SD_PTR;
    const std::size_t items_at   = 8 + value.elements.size() * (structured ? 16 : 8);
    append_word(item, static_cast<std::uint32_t>(value.elements.size()));
    append_word(item, 0);
    for (const stored_value & element : value.elements) {
        if (structured) {
            append_word(item, element.type);
            append_word(item, 0);
        }
        item += slot_of(element, items_at, items);
    }
    return item + items;
}

// A row: named columns with their values, the slots and the indirect data. Both lie in blocks of exactly their size, so
// that a sanitizer sees any step outside.
class expr_row
{
  public:
    void add(const std::string & name, stored_value value)
    {
        slots_ += slot_of(value, 0, indirect_);
        columns_.emplace_back(name, std::move(value));
    }
    // For damaged rows.
    std::string & slots() { return slots_; }
    std::string & indirect() { return indirect_; }
    const auto &  columns() const { return columns_; }

    // The answer for the compiler.
    static kt_int32_t answer(void * p_token, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t parent_id,
                             ku_validate_data_t * p_data)
    {
        const auto * p_row = static_cast<const expr_row *>(p_token);
        if (std::strlen(p_name) != length)
            return -2;
        if (parent_id != 0xFFFFFFFF) {
            if (parent_id >= p_row->columns_.size())
                return -1;
            const stored_value * p_value = &p_row->columns_[parent_id].second;
            if (p_value->type == KT_SD_PTR_ARRAY)
                p_value = &p_value->elements.at(0);
            for (std::size_t i = 0; i < p_value->field_names.size(); i++) {
                if (p_value->field_names[i] == p_name) {
                    *p_data = {p_value->elements[i].type, static_cast<kt_uint32_t>(i)};
                    return 0;
                }
            }
            return -1;
        }
        for (std::size_t i = 0; i < p_row->columns_.size(); i++) {
            if (p_row->columns_[i].first == p_name) {
                *p_data = {p_row->columns_[i].second.type, static_cast<kt_uint32_t>(i)};
                return 0;
            }
        }
        return -1;
    }

    kt_int32_t compile(const std::string & text, void ** p_p_compiled) const
    {
        // A copy of exactly its size.
        std::unique_ptr<char[]> copy(new char[text.size() + 1]);
        std::memcpy(copy.get(), text.c_str(), text.size() + 1);
        return ku_comp_expr_1(copy.get(), 0, answer, const_cast<expr_row *>(this), p_p_compiled);
    }

    // The row as ku_exec_expr_on_rows_1 takes it, in a block of exactly its size. The address of a row is that of its
    // slots; the word with the length stands in front of them, and tells 7 bytes too many.
    class record
    {
      public:
        explicit record(const expr_row & row)
        {
            const std::size_t length = row.slots_.size() + row.indirect_.size();
            block_.reset(new char[1 + sizeof(kt_uint32_t) + length]); // at an odd address
            const auto word = static_cast<kt_uint32_t>(row.indirect_.size() + excess);
            std::memcpy(block_.get() + 1, &word, sizeof word);
            std::memcpy(block_.get() + 5, row.slots_.data(), row.slots_.size());
            std::memcpy(block_.get() + 5 + row.slots_.size(), row.indirect_.data(), row.indirect_.size());
        }
        const void * address() const { return block_.get() + 5; }

      private:
        std::unique_ptr<char[]> block_;
    };
    ku_row_form_t form() const
    {
        return {static_cast<kt_uint32_t>(columns_.size()), 0, static_cast<kt_int32_t>(slots_.size()), -4, excess};
    }

    // The code 99 stands for an answer that depends on whether the row is looked at alone or as one of several.
    kt_int32_t run(void * p_compiled, kt_uint32_t * p_result) const
    {
        const kt_int32_t    rc = run_alone(p_compiled, p_result);
        const record        the_record(*this);
        const ku_row_form_t the_form    = form();
        const void * const  addresses[] = {nullptr, the_record.address(), the_record.address()};
        kt_uint64_t         matching    = 4711;
        if (ku_exec_expr_on_rows_1(p_compiled, 16, &the_form, addresses, 6, &matching) != 0 ||
            matching != (rc == 0 && *p_result == 1 ? 6u : 0u))
            return 99;
        return rc;
    }

    kt_int32_t run_alone(void * p_compiled, kt_uint32_t * p_result) const
    {
        std::unique_ptr<char[]> slots(new char[slots_.size() + 1]), indirect(new char[indirect_.size()]);
        std::memcpy(slots.get() + 1, slots_.data(), slots_.size()); // at an odd address
        std::memcpy(indirect.get(), indirect_.data(), indirect_.size());
        return ku_exec_expr_within_1(p_compiled, 16, slots.get() + 1, static_cast<kt_uint32_t>(columns_.size()),
                                     p_result, indirect.get(), static_cast<kt_uint32_t>(indirect_.size()));
    }

    // 0 or 1, or minus the code of whichever step failed.
    int evaluate(const std::string & text) const
    {
        void * p_compiled = nullptr;
        if (const kt_int32_t rc = compile(text, &p_compiled); rc != 0)
            return -rc;
        kt_uint32_t      result = 4711;
        const kt_int32_t rc     = run(p_compiled, &result);
        ku_free_expr_1(p_compiled, 0);
        return rc != 0 ? -rc : static_cast<int>(result);
    }

  private:
    static constexpr kt_uint32_t excess = 7;

    std::vector<std::pair<std::string, stored_value>> columns_;
    std::string                                       slots_;
    std::string                                       indirect_;
};

} // namespace kt_test
