// SPDX-License-Identifier: MIT
// ku_expr_code: builds the program; see ku_expr_code.h.
#include "ku_expr_code.h"
#include "ku_expr_sets.h"

#include <algorithm>
#include <cassert>
#include <cstdlib>
#include <cstring>
#include <utility>

// ---- The last instructions ----

void ku_expr_code::emit(ku_operation_t operation, unsigned detail, kt_uint32_t operand, int stack_effect)
{
    if (failed_)
        return;
    const ku_instruction_t instruction = {operation, KU_AFTER_PUSH, 0, static_cast<uint8_t>(detail), operand, 0, 0};
    if (!code_.push(instruction)) {
        failed_ = true;
        return;
    }
    depth_ = static_cast<kt_uint32_t>(static_cast<int>(depth_) + stack_effect);
    if (depth_ > deepest_)
        deepest_ = depth_;
}

void ku_expr_code::emit_constant(ku_operation_t operation, const ku_constant_t & constant)
{
    emit(operation, 0, 0, +1);
    if (failed_)
        return;
    code_[position() - 1].constant = static_cast<kt_uint32_t>(constants_.count());
    failed_                        = !constants_.push(constant);
}

void ku_expr_code::emit_column_test(ku_operation_t operation, unsigned detail, kt_uint32_t column,
                                    const ku_constant_t & constant)
{
    emit_constant(operation, constant);
    if (failed_)
        return;
    code_[position() - 1].detail  = static_cast<uint8_t>(detail);
    code_[position() - 1].operand = column;
}

ku_constant_t ku_expr_code::literal_at(kt_uint32_t offset, kt_uint32_t length) const
{
    ku_constant_t literal = {};
    literal.text          = {offset, length, 0};
    std::memcpy(&literal.text.first_bytes, texts_.data() + offset,
                std::min<size_t>(length, sizeof literal.text.first_bytes));
    return literal;
}

void ku_expr_code::emit_truth(bool value)
{
    push_integer(value ? 1 : 0);
}

// Takes back the instructions from start on, which have left so many values on the stack.
void ku_expr_code::truncate(kt_uint32_t start, kt_uint32_t values)
{
    for (kt_uint32_t i = start; i < position(); i++) {
        const uint8_t operation = code_[i].operation;
        if (operation == KU_OP_INTEGER || operation == KU_OP_FLOATING || operation == KU_OP_TEXT ||
            operation == KU_OP_LIST_CONSTANT || ku_operation_is_column_test(operation)) {
            constants_.truncate(code_[i].constant); // constants stand in the order of their instructions
            break;
        }
    }
    code_.truncate(start);
    depth_ -= values;
}

// What stands here may be jumped to from now on.
void ku_expr_code::seal()
{
    barrier_ = position();
}

bool ku_expr_code::is_alone(kt_uint32_t start, kt_uint32_t end) const
{
    return !failed_ && end == start + 1 && start >= barrier_;
}

bool ku_expr_code::is_constant(kt_uint32_t start, kt_uint32_t end) const
{
    if (!is_alone(start, end))
        return false;
    const uint8_t operation = code_[start].operation;
    return operation == KU_OP_INTEGER || operation == KU_OP_FLOATING || operation == KU_OP_TEXT;
}

bool ku_expr_code::is_column(kt_uint32_t start, kt_uint32_t end) const
{
    return is_alone(start, end) && code_[start].operation == KU_OP_COLUMN;
}

// ---- Values ----

void ku_expr_code::push_integer(ku_int_t value)
{
    ku_constant_t constant = {};
    constant.integer       = value;
    emit_constant(KU_OP_INTEGER, constant);
}

void ku_expr_code::push_floating(double value)
{
    ku_constant_t constant = {};
    constant.floating      = value;
    emit_constant(KU_OP_FLOATING, constant);
}

void ku_expr_code::push_text(kt_uint32_t offset, kt_uint32_t length)
{
    ku_constant_t constant = {};
    constant.text          = {offset, length, 0};
    emit_constant(KU_OP_TEXT, constant);
}

void ku_expr_code::push_column(kt_data_type_t type, kt_uint32_t column)
{
    emit(KU_OP_COLUMN, type, column, +1);
    if (column >= columns_needed_)
        columns_needed_ = column + 1;
}

void ku_expr_code::field(kt_data_type_t type, kt_uint32_t field)
{
    emit(KU_OP_FIELD, type, field, 0);
}

void ku_expr_code::element(kt_data_type_t type)
{
    emit(KU_OP_ELEMENT, type, 0, -1);
}

void ku_expr_code::count()
{
    emit(KU_OP_COUNT, 0, 0, 0);
}

void ku_expr_code::length()
{
    emit(KU_OP_LENGTH, 0, 0, 0);
}

void ku_expr_code::letters(ku_letters_t letters)
{
    emit(KU_OP_LETTERS, letters, 0, 0);
}

// ---- Numbers ----

namespace
{

struct arithmetic_rule {
    ku_token_kind_t      token;
    ku_operation_t       on_integers;
    ku_operation_t       on_floatings; // KU_OP_END: none
    ku_int_operation_t * p_fold;
};

constexpr arithmetic_rule arithmetic_rules[] = {
    {KU_TOKEN_PLUS, KU_OP_ADD_INTEGERS, KU_OP_ADD_FLOATINGS, ku_int_add},
    {KU_TOKEN_MINUS, KU_OP_SUBTRACT_INTEGERS, KU_OP_SUBTRACT_FLOATINGS, ku_int_subtract},
    {KU_TOKEN_STAR, KU_OP_MULTIPLY_INTEGERS, KU_OP_MULTIPLY_FLOATINGS, ku_int_multiply},
    {KU_TOKEN_SLASH, KU_OP_DIVIDE_INTEGERS, KU_OP_DIVIDE_FLOATINGS, ku_int_divide},
    {KU_TOKEN_PERCENT, KU_OP_MODULO_INTEGERS, KU_OP_END, ku_int_modulo},
    {KU_TOKEN_AND, KU_OP_AND_INTEGERS, KU_OP_END, ku_int_bits_and},
    {KU_TOKEN_XOR, KU_OP_XOR_INTEGERS, KU_OP_END, ku_int_bits_xor},
    {KU_TOKEN_OR, KU_OP_OR_INTEGERS, KU_OP_END, ku_int_bits_or}};

const arithmetic_rule & rule_of(ku_token_kind_t token)
{
    for (const arithmetic_rule & rule : arithmetic_rules) {
        if (rule.token == token)
            return rule;
    }
    __builtin_unreachable();
}

double computed(ku_operation_t operation, double left, double right)
{
    switch (operation) {
    case KU_OP_ADD_FLOATINGS:
        return left + right;
    case KU_OP_SUBTRACT_FLOATINGS:
        return left - right;
    case KU_OP_MULTIPLY_FLOATINGS:
        return left * right;
    default:
        return left / right;
    }
}

} // namespace

ku_expr_kind_t ku_expr_code::arithmetic(ku_token_kind_t token, const ku_operand_t & left, const ku_operand_t & right)
{
    const arithmetic_rule & rule = rule_of(token);
    if (left.kind == KU_KIND_INTEGER && right.kind == KU_KIND_INTEGER) {
        if (!fold_integers(rule.p_fold, left, right))
            emit(rule.on_integers, 0, 0, -1);
        return KU_KIND_INTEGER;
    }
    to_floating(left, right);
    if (!fold_floatings(rule.on_floatings, left, right))
        emit(rule.on_floatings, 0, 0, -1);
    return KU_KIND_FLOATING;
}

// Whichever of the two is an integer becomes the nearest floating-point number.
void ku_expr_code::to_floating(const ku_operand_t & left, const ku_operand_t & right)
{
    const auto convert = [this](kt_uint32_t start, kt_uint32_t end, ku_operation_t operation) {
        if (is_constant(start, end)) {
            ku_constant_t & constant = constants_[code_[start].constant];
            constant.floating        = static_cast<double>(constant.integer);
            code_[start].operation   = KU_OP_FLOATING;
        } else {
            emit(operation, 0, 0, 0);
        }
    };
    if (right.kind == KU_KIND_INTEGER)
        convert(right.start, position(), KU_OP_TO_FLOATING);
    else if (left.kind == KU_KIND_INTEGER)
        convert(left.start, right.start, KU_OP_SECOND_TO_FLOATING);
}

// A fault isn't folded: it may never be evaluated.
bool ku_expr_code::fold_integers(ku_int_operation_t * p_operation, const ku_operand_t & left,
                                 const ku_operand_t & right)
{
    if (!is_constant(left.start, right.start) || !is_constant(right.start, position()))
        return false;
    ku_int_t result = 0;
    if (!p_operation(constant_of(left.start).integer, constant_of(right.start).integer, &result))
        return false;
    truncate(left.start, 2);
    push_integer(result);
    return true;
}

bool ku_expr_code::fold_floatings(ku_operation_t operation, const ku_operand_t & left, const ku_operand_t & right)
{
    if (!is_constant(left.start, right.start) || !is_constant(right.start, position()))
        return false;
    const double result = computed(operation, constant_of(left.start).floating, constant_of(right.start).floating);
    truncate(left.start, 2);
    push_floating(result);
    return true;
}

void ku_expr_code::negate(const ku_operand_t & operand)
{
    if (is_constant(operand.start, position())) {
        const ku_constant_t constant = constant_of(operand.start);
        ku_int_t            result   = 0;
        if (operand.kind == KU_KIND_FLOATING) {
            truncate(operand.start, 1);
            return push_floating(-constant.floating);
        }
        if (ku_int_subtract(0, constant.integer, &result)) {
            truncate(operand.start, 1);
            return push_integer(result);
        }
    }
    emit(operand.kind == KU_KIND_INTEGER ? KU_OP_NEGATE_INTEGER : KU_OP_NEGATE_FLOATING, 0, 0, 0);
}

void ku_expr_code::complement(const ku_operand_t & operand)
{
    if (is_constant(operand.start, position())) {
        const ku_int_t value = constant_of(operand.start).integer;
        truncate(operand.start, 1);
        return push_integer(ku_int_complement(value, operand.width));
    }
    emit(KU_OP_COMPLEMENT, operand.width, 0, 0);
}

// ---- Comparisons ----

namespace
{

// The integers that stand in the relation to a number: from first to last, or none if first is above last.
struct int_range {
    ku_int_t first;
    ku_int_t last;
};

constexpr ku_int_t beyond_all = static_cast<ku_int_t>(1) << 66;

int_range range_of(uint8_t relation, ku_int_t value)
{
    switch (relation) {
    case KU_EQ:
        return {value, value};
    case KU_LT:
        return {-beyond_all, value - 1};
    case KU_LE:
        return {-beyond_all, value};
    case KU_GT:
        return {value + 1, beyond_all};
    default:
        return {value, beyond_all};
    }
}

int_range range_of(uint8_t relation, double value)
{
    if (std::isnan(value))
        return {1, 0};
    if (value >= ku_two_to_64)
        return range_of(relation, static_cast<ku_int_t>(1) << 65);
    if (value < -ku_two_to_63)
        return range_of(relation, -(static_cast<ku_int_t>(1) << 65));
    const double   below = std::floor(value);
    const ku_int_t whole = static_cast<ku_int_t>(below);
    if (below == value)
        return range_of(relation, whole);
    switch (relation) {
    case KU_EQ:
        return {1, 0};
    case KU_LT:
    case KU_LE:
        return {-beyond_all, whole};
    default:
        return {whole + 1, beyond_all};
    }
}

struct int_column {
    kt_data_type_t type;
    ku_operation_t test;
    ku_int_t       lowest;
    ku_int_t       highest;
};

constexpr int_column int_columns[] = {{KT_INT32, KU_OP_INT32_IN_RANGE, INT32_MIN, INT32_MAX},
                                      {KT_UINT32, KU_OP_UINT32_IN_RANGE, 0, UINT32_MAX},
                                      {KT_INT64, KU_OP_INT64_IN_RANGE, INT64_MIN, INT64_MAX},
                                      {KT_UINT64, KU_OP_UINT64_IN_RANGE, 0, UINT64_MAX}};

// The column's own value that equals a number, if it has one.
bool integer_of_column(const int_column & column, const int_range & equal, uint64_t * p_key)
{
    if (equal.first > equal.last || equal.first < column.lowest || equal.first > column.highest)
        return false;
    *p_key = ku_set_key(equal.first);
    return true;
}

bool floating_of_column(double value, uint64_t * p_key)
{
    if (std::isnan(value))
        return false;
    *p_key = ku_set_key(value);
    return true;
}

} // namespace

// Relations but KU_NE become a range of the column's own values, and that one the opposite of a range.
void ku_expr_code::test_integer_column(const ku_instruction_t & column, uint8_t relation,
                                       const ku_instruction_t & constant)
{
    const ku_constant_t value   = constants_[constant.constant];
    const bool          negated = relation == KU_NE;
    if (negated)
        relation = KU_EQ;
    int_range range =
        constant.operation == KU_OP_INTEGER ? range_of(relation, value.integer) : range_of(relation, value.floating);
    const int_column & its = int_columns[column.detail - KT_INT32];
    if (range.first < its.lowest)
        range.first = its.lowest;
    if (range.last > its.highest)
        range.last = its.highest;

    const kt_uint32_t id = column.operand;
    truncate(position() - 2, 2);
    if (range.first > range.last)
        return emit_truth(negated);
    if (range.first == its.lowest && range.last == its.highest)
        return emit_truth(!negated);
    ku_constant_t limits = {};
    limits.range         = {ku_int_bits(range.first), ku_int_bits(range.last - range.first)};
    emit_column_test(its.test, 0, id, limits);
    if (!failed_)
        code_[position() - 1].negated = negated ? 1 : 0;
}

// An integer that no floating-point number equals is replaced by its neighbour, and the relation by the one that leads
// to the same. KU_NE becomes the opposite of a relation too: NaN satisfies none that is tested.
void ku_expr_code::test_floating_column(const ku_instruction_t & column, uint8_t relation,
                                        const ku_instruction_t & constant)
{
    const bool negated = relation == KU_NE;
    if (negated)
        relation = KU_EQ;
    ku_constant_t limit = {};
    if (constant.operation == KU_OP_FLOATING) {
        limit.floating = constants_[constant.constant].floating;
    } else {
        const ku_int_t integer = constants_[constant.constant].integer;
        limit.floating         = static_cast<double>(integer);
        const uint8_t order    = ku_compare_int_with_float(integer, limit.floating);
        if (order == KU_LESS && (relation == KU_LE || relation == KU_GT))
            relation ^= KU_EQUAL; // column <= integer is column < limit
        if (order == KU_GREATER && (relation == KU_LT || relation == KU_GE))
            relation ^= KU_EQUAL; // column < integer is column <= limit
        if (order != KU_EQUAL && relation == KU_EQ) {
            truncate(position() - 2, 2);
            return emit_truth(negated);
        }
    }
    const ku_operation_t test = column.detail == KT_FLOAT32 ? KU_OP_FLOAT32_IS : KU_OP_FLOAT64_IS;
    const kt_uint32_t    id   = column.operand;
    truncate(position() - 2, 2);
    emit_column_test(test, relation, id, limit);
    if (!failed_)
        code_[position() - 1].negated = negated ? 1 : 0;
}

// The column and the constant are the last two instructions, in either order.
void ku_expr_code::test_column(const ku_instruction_t & column, uint8_t relation, const ku_instruction_t & constant)
{
    switch (ku_expr_kind_of_type(column.detail)) {
    case KU_KIND_INTEGER:
        return test_integer_column(column, relation, constant);
    case KU_KIND_FLOATING:
        return test_floating_column(column, relation, constant);
    default:
        break;
    }
    const auto        text = constants_[constant.constant].text;
    const kt_uint32_t id   = column.operand;
    truncate(position() - 2, 2);
    emit_column_test(KU_OP_STRING_IS, relation, id, literal_at(text.offset, text.length));
}

bool ku_expr_code::fuse_comparison(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right)
{
    if (ku_expr_is_bytes(left.kind) || ku_expr_is_bytes(right.kind))
        return false;
    if (is_column(left.start, right.start) && is_constant(right.start, position())) {
        test_column(ku_instruction_t(code_[left.start]), relation, ku_instruction_t(code_[right.start]));
        return true;
    }
    if (is_constant(left.start, right.start) && is_column(right.start, position())) {
        test_column(ku_instruction_t(code_[right.start]), ku_mirrored(relation), ku_instruction_t(code_[left.start]));
        return true;
    }
    return false;
}

namespace
{

ku_pair_t pair_of(ku_expr_kind_t left, ku_expr_kind_t right)
{
    if (ku_expr_is_bytes(left) || ku_expr_is_bytes(right))
        return KU_PAIR_BYTES;
    if (left == KU_KIND_STRING)
        return KU_PAIR_STRINGS;
    if (left == KU_KIND_INTEGER)
        return right == KU_KIND_INTEGER ? KU_PAIR_INTEGERS : KU_PAIR_INTEGER_WITH_FLOATING;
    return right == KU_KIND_INTEGER ? KU_PAIR_FLOATING_WITH_INTEGER : KU_PAIR_FLOATINGS;
}

constexpr ku_operation_t comparison_of_pair[] = {KU_OP_COMPARE_INTEGERS,
                                                 KU_OP_COMPARE_FLOATINGS,
                                                 KU_OP_COMPARE_INTEGER_WITH_FLOATING,
                                                 KU_OP_COMPARE_FLOATING_WITH_INTEGER,
                                                 KU_OP_COMPARE_STRINGS,
                                                 KU_OP_EQUAL_BYTES};

} // namespace

bool ku_expr_code::fold_comparison(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right)
{
    if (!ku_expr_is_number(left.kind) || !is_constant(left.start, right.start) || !is_constant(right.start, position()))
        return false;
    const ku_constant_t l = constant_of(left.start), r = constant_of(right.start);
    uint8_t             order = 0;
    if (left.kind == KU_KIND_INTEGER)
        order = right.kind == KU_KIND_INTEGER ? ku_compare_ints(l.integer, r.integer)
                                              : ku_compare_int_with_float(l.integer, r.floating);
    else
        order = right.kind == KU_KIND_INTEGER ? ku_compare_float_with_int(l.floating, r.integer)
                                              : ku_compare_floats(l.floating, r.floating);
    truncate(left.start, 2);
    emit_truth((order & relation) != 0);
    return true;
}

void ku_expr_code::compare(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right)
{
    if (failed_ || fold_comparison(relation, left, right) || fuse_comparison(relation, left, right))
        return;
    emit(comparison_of_pair[pair_of(left.kind, right.kind)], relation, 0, -1);
    if (!failed_ && code_[position() - 1].operation == KU_OP_EQUAL_BYTES)
        code_[position() - 1].negated = relation == KU_NE ? 1 : 0;
}

// ---- Other tests ----

void ku_expr_code::like(const ku_operand_t & left, const ku_operand_t & right, bool negated)
{
    constexpr ku_operation_t tests[] = {KU_OP_STRING_IS, KU_OP_STRING_STARTS_WITH, KU_OP_STRING_ENDS_WITH,
                                        KU_OP_STRING_CONTAINS};
    if (is_column(left.start, right.start) && is_constant(right.start, position())) {
        const kt_uint32_t column  = code_[left.start].operand;
        const auto        pattern = constant_of(right.start).text;
        const size_t      offset  = texts_.count();
        uint8_t *         p_new   = texts_.add(pattern.length + 1u);
        if (p_new == nullptr) {
            failed_ = true;
            return;
        }
        size_t                literal_length = 0;
        const ku_like_class_t its_class =
            ku_like_classify(texts_.data() + pattern.offset, pattern.length, p_new, &literal_length);
        texts_.truncate(its_class == KU_LIKE_GENERAL ? offset : offset + literal_length);
        if (its_class != KU_LIKE_GENERAL) {
            truncate(left.start, 2);
            emit_column_test(tests[its_class], KU_EQ, column,
                             literal_at(static_cast<kt_uint32_t>(offset), static_cast<kt_uint32_t>(literal_length)));
            if (!failed_)
                code_[position() - 1].negated = negated ? 1 : 0;
            return;
        }
    }
    emit(KU_OP_LIKE, 0, 0, -1);
    if (!failed_)
        code_[position() - 1].negated = negated ? 1 : 0;
}

void ku_expr_code::matches(kt_uint32_t regex_offset, bool negated)
{
    emit(KU_OP_MATCHES, 0, regex_offset, 0);
    if (!failed_)
        code_[position() - 1].negated = negated ? 1 : 0;
}

void ku_expr_code::value_in_array(ku_expr_kind_t value_kind, kt_data_type_t element_type, bool negated)
{
    emit(KU_OP_VALUE_IN_ARRAY, element_type, pair_of(value_kind, ku_expr_kind_of_type(element_type)), -1);
    if (!failed_)
        code_[position() - 1].negated = negated ? 1 : 0;
}

void ku_expr_code::array_has_value(ku_expr_kind_t value_kind, kt_data_type_t element_type)
{
    emit(KU_OP_ARRAY_HAS_VALUE, element_type, pair_of(value_kind, ku_expr_kind_of_type(element_type)), -1);
}

void ku_expr_code::invert(const ku_operand_t & operand)
{
    if (failed_)
        return;
    if (const int truth = constant_truth(operand); truth >= 0) {
        truncate(operand.start, 1);
        return emit_truth(truth == 0);
    }
    make_truth(operand);
    if (failed_)
        return;
    ku_instruction_t & last = code_[position() - 1];
    if (position() > barrier_ && ku_operation_is_test(last.operation)) {
        last.negated ^= 1;
        return;
    }
    emit(KU_OP_INTEGER_IS_TRUE, 0, 0, 0);
    if (!failed_)
        code_[position() - 1].negated = 1;
}

// ---- Jumps ----

// The jumps of a chain are linked by their targets until the target is known.
void ku_expr_code::link_jump(kt_uint32_t instruction, kt_uint32_t * p_chain)
{
    code_[instruction].target = *p_chain;
    *p_chain                  = instruction;
}

void ku_expr_code::end_chain(kt_uint32_t chain)
{
    if (failed_)
        return;
    while (chain != ku_no_jump)
        chain = std::exchange(code_[chain].target, position());
    seal();
}

void ku_expr_code::list_element(ku_expr_kind_t value_kind, const ku_operand_t & element, bool negated,
                                kt_uint32_t * p_chain)
{
    const uint8_t pair = pair_of(value_kind, element.kind);
    if (is_constant(element.start, position())) {
        code_[element.start].operation = KU_OP_LIST_CONSTANT;
        code_[element.start].detail    = pair;
        depth_--;
    } else {
        emit(KU_OP_LIST_ELEMENT, pair, 0, -1);
    }
    if (failed_)
        return;
    code_[position() - 1].negated = negated ? 1 : 0;
    link_jump(position() - 1, p_chain);
}

void ku_expr_code::list_end(const ku_operand_t & value, bool negated, kt_uint32_t chain)
{
    if (fuse_list(value, negated))
        return;
    emit(KU_OP_LIST_END, 0, 0, 0);
    if (failed_)
        return;
    code_[position() - 1].negated = negated ? 1 : 0;
    end_chain(chain);
}

bool ku_expr_code::is_list_of_constants(const ku_operand_t & value) const
{
    if (failed_ || value.start < barrier_ || code_[value.start].operation != KU_OP_COLUMN)
        return false;
    const ku_instruction_t * const p_end = code_.data() + position();
    return std::all_of(code_.data() + value.start + 1, p_end,
                       [](const ku_instruction_t & i) { return i.operation == KU_OP_LIST_CONSTANT; });
}

// False: no value of the column equals the element.
bool ku_expr_code::member_of_list(kt_data_type_t column_type, const ku_instruction_t & element,
                                  ku_constant_t * p_member) const
{
    const ku_constant_t value = constants_[element.constant];
    *p_member                 = {};
    uint64_t * const p_key    = &p_member->member.key;
    switch (element.detail) {
    case KU_PAIR_INTEGERS:
        return integer_of_column(int_columns[column_type - KT_INT32], range_of(KU_EQ, value.integer), p_key);
    case KU_PAIR_INTEGER_WITH_FLOATING:
        return integer_of_column(int_columns[column_type - KT_INT32], range_of(KU_EQ, value.floating), p_key);
    case KU_PAIR_FLOATING_WITH_INTEGER: {
        const double nearest = static_cast<double>(value.integer);
        return ku_compare_int_with_float(value.integer, nearest) == KU_EQUAL && floating_of_column(nearest, p_key);
    }
    case KU_PAIR_FLOATINGS:
        return floating_of_column(value.floating, p_key);
    default:
        p_member->member = {ku_set_key(texts_.data() + value.text.offset, value.text.length), value.text.offset,
                            value.text.length};
        return true;
    }
}

namespace
{

ku_operation_t set_test_of(kt_data_type_t column_type)
{
    switch (column_type) {
    case KT_INT32:
        return KU_OP_INT32_IN_SET;
    case KT_UINT32:
        return KU_OP_UINT32_IN_SET;
    case KT_INT64:
        return KU_OP_INT64_IN_SET;
    case KT_UINT64:
        return KU_OP_UINT64_IN_SET;
    case KT_FLOAT32:
        return KU_OP_FLOAT32_IN_SET;
    case KT_FLOAT64:
        return KU_OP_FLOAT64_IN_SET;
    case KT_CHAR_PTR:
        return KU_OP_STRING_IN_SET;
    default:
        return KU_OP_END; // none
    }
}

} // namespace

// A column in a list of nothing but constants becomes one test. The members take the place of the elements' constants.
bool ku_expr_code::fuse_list(const ku_operand_t & value, bool negated)
{
    if (!is_list_of_constants(value))
        return false;
    const ku_instruction_t column = code_[value.start];
    const ku_operation_t   test   = set_test_of(column.detail);
    if (test == KU_OP_END)
        return false;
    const kt_uint32_t set   = code_[value.start + 1].constant;
    kt_uint32_t       total = 0;
    for (kt_uint32_t i = value.start + 1; i < position(); i++) {
        ku_constant_t member;
        if (member_of_list(column.detail, code_[i], &member))
            constants_[set + total++] = member;
    }
    code_.truncate(value.start);
    constants_.truncate(set + total);
    depth_--;
    if (total == 0) { // of numbers, which are whatever their slot holds: nothing can be damaged
        emit_truth(negated);
        return true;
    }
    // The first member makes room for the number of them.
    const ku_constant_t first = constants_[set];
    if (!constants_.push(first)) {
        failed_ = true;
        return true;
    }
    ku_constant_t * const p_set = constants_.data() + set;
    *p_set                      = {};
    p_set->set.members          = total;
    std::sort(p_set + 1, p_set + 1 + total,
              [](const ku_constant_t & l, const ku_constant_t & r) { return l.member.key < r.member.key; });
    emit(test, 0, column.operand, +1);
    if (failed_)
        return true;
    code_[position() - 1].constant = set;
    code_[position() - 1].negated  = negated ? 1 : 0;
    return true;
}

int ku_expr_code::constant_truth(const ku_operand_t & operand) const
{
    if (!is_constant(operand.start, position()))
        return -1;
    const ku_constant_t & constant = constant_of(operand.start);
    return (operand.kind == KU_KIND_INTEGER ? constant.integer != 0 : constant.floating != 0.0) ? 1 : 0;
}

void ku_expr_code::decide(const ku_operand_t & operand, ku_after_t after, kt_uint32_t * p_chain)
{
    if (failed_)
        return;
    if (position() <= barrier_ || !ku_operation_is_test(code_[position() - 1].operation))
        emit(operand.kind == KU_KIND_INTEGER ? KU_OP_INTEGER_IS_TRUE : KU_OP_FLOATING_IS_TRUE, 0, 0, 0);
    if (failed_)
        return;
    code_[position() - 1].after = after;
    depth_--;
    link_jump(position() - 1, p_chain);
}

void ku_expr_code::make_truth(const ku_operand_t & operand)
{
    if (failed_ || operand.truth)
        return;
    if (const int truth = constant_truth(operand); truth >= 0) {
        truncate(operand.start, 1);
        return emit_truth(truth != 0);
    }
    emit(operand.kind == KU_KIND_INTEGER ? KU_OP_INTEGER_IS_TRUE : KU_OP_FLOATING_IS_TRUE, 0, 0, 0);
}

void ku_expr_code::drop(const ku_operand_t & operand)
{
    if (failed_)
        return;
    truncate(operand.start, 1);
    if (barrier_ > position())
        seal();
}

// ---- A string literal's text ----

void ku_expr_code::text_of_literal(const ku_operand_t & literal, kt_uint32_t * p_offset, kt_uint32_t * p_length) const
{
    const auto text = constant_of(literal.start).text;
    *p_offset       = text.offset;
    *p_length       = text.length;
}

void ku_expr_code::replace_text(const ku_operand_t & literal, kt_uint32_t offset, kt_uint32_t length)
{
    constants_[code_[literal.start].constant].text = {offset, length, 0};
}

// ---- The end ----

kt_int32_t ku_expr_code::finish(ku_program_t ** p_p_program)
{
    emit(KU_OP_END, 0, 0, -1);
    if (failed_)
        return KU_EXPR_E_NO_MEMORY;
    assert(depth_ == 0);
    assert(deepest_ <= ku_expr_deepest_stack);
    const size_t constant_bytes = constants_.count() * sizeof(ku_constant_t);
    const size_t code_bytes     = code_.count() * sizeof(ku_instruction_t);
    const size_t head_bytes     = sizeof(ku_program_t);
    auto * const p_block =
        static_cast<uint8_t *>(std::malloc(head_bytes + constant_bytes + code_bytes + texts_.count()));
    if (p_block == nullptr)
        return KU_EXPR_E_NO_MEMORY;

    const ku_program_t head = {columns_needed_, deepest_, static_cast<kt_uint32_t>(head_bytes + constant_bytes),
                               static_cast<kt_uint32_t>(head_bytes + constant_bytes + code_bytes)};
    std::memcpy(p_block, &head, head_bytes);
    if (constant_bytes != 0)
        std::memcpy(p_block + head_bytes, constants_.data(), constant_bytes);
    std::memcpy(p_block + head.instructions_offset, code_.data(), code_bytes);
    if (texts_.count() != 0)
        std::memcpy(p_block + head.texts_offset, texts_.data(), texts_.count());
    *p_p_program = reinterpret_cast<ku_program_t *>(p_block);
    return 0;
}
