// SPDX-License-Identifier: MIT
// ku_expr_tests: the tests of a column against constants, for the machine and for many rows at once. Internal.
//
// Each operation is a template's instance, so that a loop over rows has nothing to decide but the rows' own values.
#pragma once

#include <algorithm>
#include <bit>
#include <cstring>

#include "ku_expr.h"
#include "ku_expr_sets.h"
#include "ku_expr_stored.h"

// Every operation that needs nothing but a column and constants.
#define KU_FOR_EACH_COLUMN_TEST(do_it)                                                                                 \
    do_it(KU_OP_INT32_IN_RANGE) do_it(KU_OP_UINT32_IN_RANGE) do_it(KU_OP_INT64_IN_RANGE) do_it(KU_OP_UINT64_IN_RANGE)  \
        do_it(KU_OP_FLOAT32_IS) do_it(KU_OP_FLOAT64_IS) do_it(KU_OP_INT32_IN_SET) do_it(KU_OP_UINT32_IN_SET)           \
            do_it(KU_OP_INT64_IN_SET) do_it(KU_OP_UINT64_IN_SET) do_it(KU_OP_FLOAT32_IN_SET)                           \
                do_it(KU_OP_FLOAT64_IN_SET) do_it(KU_OP_STRING_IS) do_it(KU_OP_STRING_IN_SET)                          \
                    do_it(KU_OP_STRING_STARTS_WITH) do_it(KU_OP_STRING_ENDS_WITH) do_it(KU_OP_STRING_CONTAINS)

// What a test finds.
enum ku_finding_t : unsigned { KU_FOUND_FALSE, KU_FOUND_TRUE, KU_FOUND_DAMAGED };

struct ku_row_t {
    const uint8_t * p_values;
    ku_extent_t     indirect;
};

// ---- Bytes ----

inline uint8_t ku_compare_bytes(const uint8_t * p_left, size_t left_length, const uint8_t * p_right,
                                size_t right_length)
{
    const size_t common     = std::min(left_length, right_length);
    const int    comparison = common != 0 ? std::memcmp(p_left, p_right, common) : 0;
    if (comparison != 0)
        return comparison < 0 ? KU_LESS : KU_GREATER;
    if (left_length == right_length)
        return KU_EQUAL;
    return left_length < right_length ? KU_LESS : KU_GREATER;
}

// Short runs of bytes without a call: the length is the same for every row.
inline bool ku_begin_equally(const uint8_t * p, const uint8_t * q, size_t length)
{
    if (length > 8)
        return std::memcmp(p, q, length) == 0;
    if (length >= 4)
        return ku_load<uint32_t>(p) == ku_load<uint32_t>(q) &&
               ku_load<uint32_t>(p + length - 4) == ku_load<uint32_t>(q + length - 4);
    if (length >= 2)
        return ku_load<uint16_t>(p) == ku_load<uint16_t>(q) &&
               ku_load<uint16_t>(p + length - 2) == ku_load<uint16_t>(q + length - 2);
    return length == 0 || *p == *q;
}

// ---- The column's value ----

// The 64 bits of a stored integer as its type says.
template <ku_operation_t Operation> uint64_t ku_integer_bits(const uint8_t * p_slot)
{
    if constexpr (Operation == KU_OP_INT32_IN_RANGE || Operation == KU_OP_INT32_IN_SET)
        return static_cast<uint64_t>(static_cast<int64_t>(ku_load<kt_int32_t>(p_slot)));
    else if constexpr (Operation == KU_OP_UINT32_IN_RANGE || Operation == KU_OP_UINT32_IN_SET)
        return ku_load<kt_uint32_t>(p_slot);
    else
        return ku_load<kt_uint64_t>(p_slot);
}

template <ku_operation_t Operation> double ku_floating(const uint8_t * p_slot)
{
    if constexpr (Operation == KU_OP_FLOAT32_IS || Operation == KU_OP_FLOAT32_IN_SET)
        return static_cast<double>(ku_load<kt_float32_t>(p_slot));
    else
        return ku_load<kt_float64_t>(p_slot);
}

// ---- Strings ----

// The first n bytes, at most 8, of a word as it lies in memory.
inline uint64_t ku_mask_of_first_bytes(size_t n)
{
    constexpr unsigned bits = 64;
    if (n == 0)
        return 0;
    const unsigned others = bits - 8 * static_cast<unsigned>(std::min(n, sizeof(uint64_t)));
    return std::endian::native == std::endian::little ? ~uint64_t{0} >> others : ~uint64_t{0} << others;
}

// A constant string beside the strings of a column. Those have a terminator within their item, and it has none in it:
// so where the bytes are equal, the item goes on behind them.
class ku_literal_t
{
  public:
    ku_literal_t() = default;
    ku_literal_t(const ku_program_t & program, const ku_constant_t & constant)
        : p_(program.texts() + constant.text.offset), length_(constant.text.length),
          first_bytes_(constant.text.first_bytes), mask_(ku_mask_of_first_bytes(length_)),
          mask_with_terminator_(ku_mask_of_first_bytes(length_ + 1))
    {
    }

    bool starts(const ku_extent_t & item) const
    {
        if (item.length < word_size)
            return item.length > length_ && ku_begin_equally(item.p, p_, length_);
        return has_first_bytes(item, mask_) && (length_ <= word_size || goes_on(item));
    }
    bool equals(const ku_extent_t & item) const
    {
        if (length_ < word_size && item.length >= word_size)
            return has_first_bytes(item, mask_with_terminator_);
        return starts(item) && item.p[length_] == '\0';
    }
    // Of a string without its terminator.
    bool ends(const ku_extent_t & s) const
    {
        return s.length >= length_ && ku_begin_equally(s.p + s.length - length_, p_, length_);
    }
    bool    lies_in(const ku_extent_t & s) const { return memmem(s.p, s.length, p_, length_) != nullptr; }
    uint8_t compare(const ku_extent_t & s) const { return ku_compare_bytes(s.p, s.length, p_, length_); }

  private:
    static constexpr size_t word_size = sizeof(uint64_t);

    bool has_first_bytes(const ku_extent_t & item, uint64_t mask) const
    {
        return ((ku_load<uint64_t>(item.p) ^ first_bytes_) & mask) == 0;
    }
    bool goes_on(const ku_extent_t & item) const
    {
        return item.length > length_ && ku_begin_equally(item.p + word_size, p_ + word_size, length_ - word_size);
    }

    const uint8_t * p_                    = nullptr;
    size_t          length_               = 0;
    uint64_t        first_bytes_          = 0;
    uint64_t        mask_                 = 0;
    uint64_t        mask_with_terminator_ = 0;
};

// ---- Tests ----

// A test of a column, made ready for any number of rows: what is the same for all of them is looked up once.
template <ku_operation_t Operation> class ku_column_test_t
{
  public:
    ku_column_test_t(const ku_program_t & program, const ku_instruction_t & instruction)
        : slot_(static_cast<size_t>(instruction.operand) * ku_slot_size), relation_(instruction.detail),
          p_constant_(program.constants() + instruction.constant), constant_(*p_constant_),
          literal_(has_literal ? ku_literal_t(program, constant_) : ku_literal_t()), p_texts_(program.texts())
    {
    }

    ku_finding_t operator()(const ku_row_t & row) const
    {
        const uint8_t * const p_slot = row.p_values + slot_;
        switch (Operation) {
        case KU_OP_INT32_IN_RANGE:
        case KU_OP_UINT32_IN_RANGE:
        case KU_OP_INT64_IN_RANGE:
        case KU_OP_UINT64_IN_RANGE:
            return found(ku_integer_bits<Operation>(p_slot) - constant_.range.low <= constant_.range.span);
        case KU_OP_INT32_IN_SET:
        case KU_OP_UINT32_IN_SET:
        case KU_OP_INT64_IN_SET:
        case KU_OP_UINT64_IN_SET:
            return found(ku_set_find(p_constant_, ku_integer_bits<Operation>(p_slot)) != nullptr);
        case KU_OP_FLOAT32_IS:
        case KU_OP_FLOAT64_IS:
            return found((ku_order_of_floats(ku_floating<Operation>(p_slot), constant_.floating) & relation_) != 0);
        case KU_OP_FLOAT32_IN_SET:
        case KU_OP_FLOAT64_IN_SET:
            return found(ku_set_find(p_constant_, ku_set_key(ku_floating<Operation>(p_slot))) != nullptr);
        default:
            ku_extent_t item;
            if (!ku_read_item(p_slot, row.indirect, &item) || !ku_item_is_terminated(item))
                return KU_FOUND_DAMAGED;
            return found(test_string(item));
        }
    }

  private:
    static ku_finding_t found(bool truth) { return static_cast<ku_finding_t>(truth); }

    bool test_string(const ku_extent_t & item) const
    {
        const auto string = [&item] { return ku_extent_t{item.p, ku_string_length(item)}; };
        switch (Operation) {
        case KU_OP_STRING_IN_SET:
            return ku_set_has_string(p_constant_, p_texts_, string());
        case KU_OP_STRING_STARTS_WITH:
            return literal_.starts(item);
        case KU_OP_STRING_ENDS_WITH:
            return literal_.ends(string());
        case KU_OP_STRING_CONTAINS:
            return literal_.lies_in(string());
        default: // equality needs no length
            return relation_ == KU_EQ ? literal_.equals(item) : (literal_.compare(string()) & relation_) != 0;
        }
    }

    static constexpr bool has_literal = Operation == KU_OP_STRING_IS || Operation == KU_OP_STRING_STARTS_WITH ||
                                        Operation == KU_OP_STRING_ENDS_WITH || Operation == KU_OP_STRING_CONTAINS;

    const size_t                slot_;
    const uint8_t               relation_;
    const ku_constant_t * const p_constant_;
    const ku_constant_t         constant_;
    const ku_literal_t          literal_;
    const uint8_t * const       p_texts_;
};
