// SPDX-License-Identifier: MIT
// ku_expr_tests: the tests of a column against constants, for the machine and for many rows at once. Internal.
//
// Each operation is a template's instance, so that a loop over rows has nothing to decide but the rows' own values.
#pragma once

#include <algorithm>
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

inline const uint8_t * ku_slot(const ku_row_t & row, const ku_instruction_t & instruction)
{
    return row.p_values + static_cast<size_t>(instruction.operand) * ku_slot_size;
}

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

// Whether a whole string, whose terminator lies within its item, has this constant string's relation to it.
template <ku_operation_t Operation>
bool ku_test_string(const ku_program_t & program, const ku_instruction_t & instruction, const ku_extent_t & item)
{
    const ku_constant_t & constant = program.constants()[instruction.constant];
    if constexpr (Operation == KU_OP_STRING_IN_SET) {
        return ku_set_has_string(&constant, program.texts(), item.p, ku_string_length(item));
    } else {
        const uint8_t * const p_literal = program.texts() + constant.text.offset;
        const size_t          length    = constant.text.length;
        const auto starts_with = [&] { return item.length > length && ku_begin_equally(item.p, p_literal, length); };
        if constexpr (Operation == KU_OP_STRING_STARTS_WITH)
            return starts_with();
        // The literal has no terminator in it, so this tells an equal string without measuring it.
        if (Operation == KU_OP_STRING_IS && instruction.detail == KU_EQ)
            return starts_with() && item.p[length] == '\0';
        const kt_uint32_t its_length = ku_string_length(item);
        if constexpr (Operation == KU_OP_STRING_ENDS_WITH)
            return its_length >= length && ku_begin_equally(item.p + its_length - length, p_literal, length);
        else if constexpr (Operation == KU_OP_STRING_CONTAINS)
            return memmem(item.p, its_length, p_literal, length) != nullptr;
        else
            return (ku_compare_bytes(item.p, its_length, p_literal, length) & instruction.detail) != 0;
    }
}

// ---- Tests ----

template <ku_operation_t Operation>
ku_finding_t ku_test_column(const ku_program_t & program, const ku_instruction_t & instruction, const ku_row_t & row)
{
    const uint8_t * const       p_slot     = ku_slot(row, instruction);
    const ku_constant_t * const p_constant = program.constants() + instruction.constant;
    const auto                  found      = [](bool truth) { return static_cast<ku_finding_t>(truth); };
    switch (Operation) {
    case KU_OP_INT32_IN_RANGE:
    case KU_OP_UINT32_IN_RANGE:
    case KU_OP_INT64_IN_RANGE:
    case KU_OP_UINT64_IN_RANGE:
        return found(ku_integer_bits<Operation>(p_slot) - p_constant->range.low <= p_constant->range.span);
    case KU_OP_INT32_IN_SET:
    case KU_OP_UINT32_IN_SET:
    case KU_OP_INT64_IN_SET:
    case KU_OP_UINT64_IN_SET:
        return found(ku_set_find(p_constant, ku_integer_bits<Operation>(p_slot)) != nullptr);
    case KU_OP_FLOAT32_IS:
    case KU_OP_FLOAT64_IS:
        return found((ku_compare_floats(ku_floating<Operation>(p_slot), p_constant->floating) & instruction.detail) !=
                     0);
    case KU_OP_FLOAT32_IN_SET:
    case KU_OP_FLOAT64_IN_SET:
        return found(ku_set_find(p_constant, ku_set_key(ku_floating<Operation>(p_slot))) != nullptr);
    default:
        ku_extent_t item;
        if (!ku_read_item(p_slot, row.indirect, &item) || !ku_item_is_terminated(item))
            return KU_FOUND_DAMAGED;
        return found(ku_test_string<Operation>(program, instruction, item));
    }
}
