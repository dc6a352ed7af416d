// SPDX-License-Identifier: MIT
// ku_expr_eval: runs a program on a row.
//
// Always holds: the program was built by the compiler, so its types, jumps and stack are right and are not tested here;
// the row may be anything, so every address that comes from it is. Nothing is allocated and nothing is written but the
// machine's stack, so several threads may run one program at once.
// Failure: the first fault ends the run with its code.
#include "ku_expr.h"
#include "ku_expr_stored.h"
#include "ku_expr_tests.h"
#include "ku_regex.h"

#include <algorithm>
#include <cstring>

namespace
{

constexpr kt_uint32_t usual_stack = 32;

// ---- Strings ----

ku_text_t text_of(const ku_value_t & value)
{
    return {value.bytes.p, value.bytes.length, static_cast<uint8_t>(value.bytes.letters)};
}

uint8_t compare_shown(const ku_text_t & left, const ku_text_t & right)
{
    const uint8_t * p_left_shown  = ku_letter_tables.shown[left.letters];
    const uint8_t * p_right_shown = ku_letter_tables.shown[right.letters];
    const size_t    common        = std::min(left.length, right.length);
    for (size_t i = 0; i < common; i++) {
        const uint8_t l = p_left_shown[left.p[i]], r = p_right_shown[right.p[i]];
        if (l != r)
            return l < r ? KU_LESS : KU_GREATER;
    }
    if (left.length == right.length)
        return KU_EQUAL;
    return left.length < right.length ? KU_LESS : KU_GREATER;
}

uint8_t compare_strings(const ku_value_t & left, const ku_value_t & right)
{
    if (left.bytes.letters == KU_LETTERS_AS_THEY_ARE && right.bytes.letters == KU_LETTERS_AS_THEY_ARE)
        return ku_compare_bytes(left.bytes.p, left.bytes.length, right.bytes.p, right.bytes.length);
    return compare_shown(text_of(left), text_of(right));
}

bool bytes_are_equal(const ku_value_t & left, const ku_value_t & right)
{
    return left.bytes.length == right.bytes.length &&
           (left.bytes.length == 0 || std::memcmp(left.bytes.p, right.bytes.p, left.bytes.length) == 0);
}

// ---- Equality by pair of types ----

bool are_equal(uint8_t pair, const ku_value_t & left, const ku_value_t & right)
{
    switch (pair) {
    case KU_PAIR_INTEGERS:
        return left.integer == right.integer;
    case KU_PAIR_FLOATINGS:
        return ku_compare_floats(left.floating, right.floating) == KU_EQUAL;
    case KU_PAIR_INTEGER_WITH_FLOATING:
        return ku_compare_int_with_float(left.integer, right.floating) == KU_EQUAL;
    case KU_PAIR_FLOATING_WITH_INTEGER:
        return ku_compare_float_with_int(left.floating, right.integer) == KU_EQUAL;
    case KU_PAIR_STRINGS:
        return compare_strings(left, right) == KU_EQUAL;
    default:
        return bytes_are_equal(left, right);
    }
}

// Numbers in lists are as common as long lists of them, so integers come first.
bool equals_constant(uint8_t pair, const ku_value_t & left, const ku_constant_t & constant, const uint8_t * p_texts)
{
    if (pair == KU_PAIR_INTEGERS) [[likely]]
        return left.integer == constant.integer;
    ku_value_t right;
    if (pair == KU_PAIR_FLOATING_WITH_INTEGER)
        right.integer = constant.integer;
    else if (pair == KU_PAIR_FLOATINGS || pair == KU_PAIR_INTEGER_WITH_FLOATING)
        right.floating = constant.floating;
    else
        right.bytes = {p_texts + constant.text.offset, constant.text.length, KU_LETTERS_AS_THEY_ARE};
    return are_equal(pair, left, right);
}

// Looks for the value among the elements. The first one that is damaged ends the search.
[[nodiscard]] kt_int32_t find_in_array(const ku_instruction_t & instruction, const ku_value_t & value,
                                       const ku_value_t & array, bool * p_found)
{
    const ku_extent_t item  = {array.bytes.p, array.bytes.length};
    const kt_uint32_t count = ku_element_count(array);
    *p_found                = false;
    for (kt_uint32_t i = 0; i < count && !*p_found; i++) {
        ku_value_t element;
        if (!ku_read_value(instruction.detail, item.p + ku_array_head_size + i * ku_slot_size, item, &element))
            return KU_EXPR_E_DAMAGED_VALUE;
        *p_found = are_equal(static_cast<uint8_t>(instruction.operand), value, element);
    }
    return 0;
}

[[nodiscard]] kt_int32_t take_field(const ku_instruction_t & instruction, ku_value_t * p_value)
{
    const ku_extent_t item = {p_value->bytes.p, p_value->bytes.length};
    if (instruction.operand >= ku_element_count(*p_value))
        return KU_EXPR_E_NO_SUCH_ELEMENT;
    const uint8_t * p_entry =
        item.p + ku_array_head_size + static_cast<size_t>(instruction.operand) * ku_sd_element_size;
    if (ku_load<kt_data_type_t>(p_entry) != instruction.detail)
        return KU_EXPR_E_DAMAGED_VALUE;
    return ku_read_value(instruction.detail, p_entry + ku_slot_size, item, p_value) ? 0 : KU_EXPR_E_DAMAGED_VALUE;
}

[[nodiscard]] kt_int32_t take_element(const ku_instruction_t & instruction, ku_int_t index, ku_value_t * p_value)
{
    const ku_extent_t item = {p_value->bytes.p, p_value->bytes.length};
    if (index < 0 || index >= ku_element_count(*p_value))
        return KU_EXPR_E_NO_SUCH_ELEMENT;
    const uint8_t * p_slot = item.p + ku_array_head_size + static_cast<size_t>(index) * ku_slot_size;
    return ku_read_value(instruction.detail, p_slot, item, p_value) ? 0 : KU_EXPR_E_DAMAGED_VALUE;
}

// ---- The machine ----

template <kt_uint32_t Room>
[[nodiscard]] kt_int32_t run(const ku_program_t & program, const ku_instruction_t * p, const ku_row_t & row,
                             kt_uint32_t * p_result)
{
    const ku_constant_t * const    p_constants    = program.constants();
    const ku_instruction_t * const p_instructions = program.instructions();
    ku_value_t                     stack[Room + 1]; // the lowest value stands at 1
    size_t                         top   = 0;
    bool                           truth = false;

    for (;; p++) {
        switch (p->operation) {
        case KU_OP_END:
            *p_result = stack[top].integer != 0 ? 1 : 0;
            return 0;

        case KU_OP_INTEGER:
            stack[++top].integer = p_constants[p->constant].integer;
            continue;
        case KU_OP_FLOATING:
            stack[++top].floating = p_constants[p->constant].floating;
            continue;
        case KU_OP_TEXT: {
            const auto & text  = p_constants[p->constant].text;
            stack[++top].bytes = {program.texts() + text.offset, text.length, KU_LETTERS_AS_THEY_ARE};
            continue;
        }
        case KU_OP_COLUMN:
            if (!ku_read_value(p->detail, row.p_values + static_cast<size_t>(p->operand) * ku_slot_size, row.indirect,
                               &stack[++top]))
                return KU_EXPR_E_DAMAGED_VALUE;
            continue;
        case KU_OP_FIELD:
            if (const kt_int32_t rc = take_field(*p, &stack[top]); rc != 0)
                return rc;
            continue;
        case KU_OP_ELEMENT: {
            const ku_int_t index = stack[top--].integer;
            if (const kt_int32_t rc = take_element(*p, index, &stack[top]); rc != 0)
                return rc;
            continue;
        }
        case KU_OP_COUNT:
            stack[top].integer = ku_element_count(stack[top]);
            continue;
        case KU_OP_LENGTH:
            stack[top].integer = stack[top].bytes.length;
            continue;
        case KU_OP_LETTERS:
            stack[top].bytes.letters = p->detail;
            continue;

        case KU_OP_TO_FLOATING:
            stack[top].floating = static_cast<double>(stack[top].integer);
            continue;
        case KU_OP_SECOND_TO_FLOATING:
            stack[top - 1].floating = static_cast<double>(stack[top - 1].integer);
            continue;
        case KU_OP_NEGATE_INTEGER:
            if (!ku_int_subtract(0, stack[top].integer, &stack[top].integer))
                return KU_EXPR_E_INTEGER_FAULT;
            continue;
        case KU_OP_NEGATE_FLOATING:
            stack[top].floating = -stack[top].floating;
            continue;
        case KU_OP_COMPLEMENT:
            stack[top].integer = ku_int_complement(stack[top].integer, p->detail);
            continue;
#define KU_INTEGER_OPERATION(operation, function)                                                                      \
    case operation:                                                                                                    \
        top--;                                                                                                         \
        if (!function(stack[top].integer, stack[top + 1].integer, &stack[top].integer))                                \
            return KU_EXPR_E_INTEGER_FAULT;                                                                            \
        continue;
            KU_INTEGER_OPERATION(KU_OP_ADD_INTEGERS, ku_int_add)
            KU_INTEGER_OPERATION(KU_OP_SUBTRACT_INTEGERS, ku_int_subtract)
            KU_INTEGER_OPERATION(KU_OP_MULTIPLY_INTEGERS, ku_int_multiply)
            KU_INTEGER_OPERATION(KU_OP_DIVIDE_INTEGERS, ku_int_divide)
            KU_INTEGER_OPERATION(KU_OP_MODULO_INTEGERS, ku_int_modulo)
            KU_INTEGER_OPERATION(KU_OP_AND_INTEGERS, ku_int_bits_and)
            KU_INTEGER_OPERATION(KU_OP_XOR_INTEGERS, ku_int_bits_xor)
            KU_INTEGER_OPERATION(KU_OP_OR_INTEGERS, ku_int_bits_or)
#undef KU_INTEGER_OPERATION
        case KU_OP_ADD_FLOATINGS:
            top--;
            stack[top].floating += stack[top + 1].floating;
            continue;
        case KU_OP_SUBTRACT_FLOATINGS:
            top--;
            stack[top].floating -= stack[top + 1].floating;
            continue;
        case KU_OP_MULTIPLY_FLOATINGS:
            top--;
            stack[top].floating *= stack[top + 1].floating;
            continue;
        case KU_OP_DIVIDE_FLOATINGS:
            top--;
            stack[top].floating /= stack[top + 1].floating;
            continue;

        case KU_OP_LIST_ELEMENT:
            top--;
            if (are_equal(p->detail, stack[top], stack[top + 1])) {
                stack[top].integer = 1 ^ p->negated;
                p                  = p_instructions + p->target - 1;
            }
            continue;
        case KU_OP_LIST_CONSTANT:
            if (equals_constant(p->detail, stack[top], p_constants[p->constant], program.texts())) {
                stack[top].integer = 1 ^ p->negated;
                p                  = p_instructions + p->target - 1;
            }
            continue;
        case KU_OP_LIST_END:
            stack[top].integer = p->negated;
            continue;

#define KU_COLUMN_TEST(operation)                                                                                      \
    case operation: {                                                                                                  \
        const ku_finding_t found = ku_column_test_t<operation>(program, *p)(row);                                      \
        if (found == KU_FOUND_DAMAGED)                                                                                 \
            return KU_EXPR_E_DAMAGED_VALUE;                                                                            \
        truth = found == KU_FOUND_TRUE;                                                                                \
        break;                                                                                                         \
    }
            KU_FOR_EACH_COLUMN_TEST(KU_COLUMN_TEST)
#undef KU_COLUMN_TEST

        case KU_OP_COMPARE_INTEGERS:
            top -= 2;
            truth = (ku_compare_ints(stack[top + 1].integer, stack[top + 2].integer) & p->detail) != 0;
            break;
        case KU_OP_COMPARE_FLOATINGS:
            top -= 2;
            truth = (ku_compare_floats(stack[top + 1].floating, stack[top + 2].floating) & p->detail) != 0;
            break;
        case KU_OP_COMPARE_INTEGER_WITH_FLOATING:
            top -= 2;
            truth = (ku_compare_int_with_float(stack[top + 1].integer, stack[top + 2].floating) & p->detail) != 0;
            break;
        case KU_OP_COMPARE_FLOATING_WITH_INTEGER:
            top -= 2;
            truth = (ku_compare_float_with_int(stack[top + 1].floating, stack[top + 2].integer) & p->detail) != 0;
            break;
        case KU_OP_COMPARE_STRINGS:
            top -= 2;
            truth = (compare_strings(stack[top + 1], stack[top + 2]) & p->detail) != 0;
            break;
        case KU_OP_EQUAL_BYTES:
            top -= 2;
            truth = bytes_are_equal(stack[top + 1], stack[top + 2]);
            break;
        case KU_OP_LIKE:
            top -= 2;
            truth = ku_like_matches(text_of(stack[top + 1]), text_of(stack[top + 2]));
            break;
        case KU_OP_MATCHES:
            top--;
            truth = ku_regex_is_found(*reinterpret_cast<const ku_regex_program_t *>(program.texts() + p->operand),
                                      text_of(stack[top + 1]));
            break;
        case KU_OP_INTEGER_IS_TRUE:
            truth = stack[top--].integer != 0;
            break;
        case KU_OP_FLOATING_IS_TRUE:
            truth = stack[top--].floating != 0.0;
            break;
        case KU_OP_VALUE_IN_ARRAY:
            top -= 2;
            if (const kt_int32_t rc = find_in_array(*p, stack[top + 1], stack[top + 2], &truth); rc != 0)
                return rc;
            break;
        case KU_OP_ARRAY_HAS_VALUE:
            top -= 2;
            if (const kt_int32_t rc = find_in_array(*p, stack[top + 2], stack[top + 1], &truth); rc != 0)
                return rc;
            break;
        default:
            __builtin_unreachable();
        }

        // A test has found its truth value.
        const unsigned value = static_cast<unsigned>(truth) ^ p->negated;
        if (p->after == KU_AFTER_PUSH) {
            stack[++top].integer = value;
        } else if (value == static_cast<unsigned>(p->after == KU_AFTER_JUMP_IF_TRUE)) {
            stack[++top].integer = value;
            p                    = p_instructions + p->target - 1;
        }
    }
}

} // namespace

kt_int32_t ku_expr_run(const ku_program_t & program, const ku_instruction_t * p_first, const ku_row_t & row,
                       kt_uint32_t * p_result)
{
    if (program.stack_needed <= usual_stack)
        return run<usual_stack>(program, p_first, row, p_result);
    return run<ku_expr_deepest_stack>(program, p_first, row, p_result);
}
