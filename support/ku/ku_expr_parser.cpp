// SPDX-License-Identifier: MIT
// ku_expr_parser: reads an expression, checks its types and has its program built, in one pass.
//
// One function for each rule of the grammar (docs/SELECTION.md), from the weakest operator to the strongest. Each
// leaves instructions that put one value on the stack, and an operand that tells its type. Always holds: the recursion
// is as deep as the text is nested, and that is at most 250 levels. Operators in a row are loops. Failure: the first
// trouble ends it, with a place and a reason.
#include "ku_expr.h"
#include "ku_expr_code.h"
#include "ku_regex.h"
#include "ku_utf8.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <limits>

namespace
{

constexpr kt_uint32_t top_level = UINT32_MAX; // the parent of a column
// What regular expressions may need together.
constexpr size_t most_text_bytes = 16 * 1024 * 1024;

// A name shown in a diagnosis, cut short if it is very long.
struct shown_token {
    int          length;
    const char * p;
};

shown_token shown(const ku_token_t & token)
{
    constexpr long longest = 60;
    long           length  = token.p_end - token.p_start;
    if (length > longest) {
        for (length = longest; (token.p_start[length] & 0xC0) == 0x80;)
            length--;
    }
    return {static_cast<int>(length), token.p_start};
}

uint8_t relation_of(ku_token_kind_t token)
{
    switch (token) {
    case KU_TOKEN_EQ:
        return KU_EQ;
    case KU_TOKEN_NE:
        return KU_NE;
    case KU_TOKEN_LT:
        return KU_LT;
    case KU_TOKEN_LE:
        return KU_LE;
    case KU_TOKEN_GT:
        return KU_GT;
    case KU_TOKEN_GE:
        return KU_GE;
    default:
        return 0;
    }
}

enum class function { none, length, count, lower, upper, contains };

struct function_name {
    const char * p_name;
    function     which;
    unsigned     arguments;
};

constexpr function_name functions[] = {{"length", function::length, 1},
                                       {"count", function::count, 1},
                                       {"lower", function::lower, 1},
                                       {"upper", function::upper, 1},
                                       {"contains", function::contains, 2}};

class parser
{
  public:
    parser(const char * p_text, const char * p_end, ku_validate_callback_t * p_callback, void * p_token,
           ku_expr_trouble_t * p_trouble)
        : p_next_(p_text), p_end_(p_end), p_callback_(p_callback), p_callback_token_(p_token), p_trouble_(p_trouble)
    {
    }

    [[nodiscard]] kt_int32_t parse(ku_program_t ** p_p_program);

  private:
    // ---- Tokens and trouble ----
    [[nodiscard]] kt_int32_t advance()
    {
        const kt_int32_t rc = ku_expr_read_token(p_next_, p_end_, &token_, p_trouble_);
        p_next_             = token_.p_end;
        return rc;
    }
    [[nodiscard]] kt_int32_t refuse_syntax(const char * p_expected) const;
    [[nodiscard]] kt_int32_t refuse_types(const char * p_at, const char * p_operator, const ku_operand_t & left,
                                          const ku_operand_t & right) const;
    [[nodiscard]] kt_int32_t refuse_type(const char * p_at, const char * p_wanted, const ku_operand_t & operand) const;
    [[nodiscard]] kt_int32_t refuse_memory() const;
    [[nodiscard]] kt_int32_t expect(ku_token_kind_t kind, const char * p_expected);
    [[nodiscard]] kt_int32_t enter(const char * p_at);
    void                     leave() { depth_--; }

    // ---- The grammar ----
    using rule = kt_int32_t (parser::*)(ku_operand_t *);
    [[nodiscard]] kt_int32_t read_expression(ku_operand_t * p_result); // ||
    [[nodiscard]] kt_int32_t read_and(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_not(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_comparison(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_bits(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_sum(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_product(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_unary(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_primary(ku_operand_t * p_result);

    [[nodiscard]] kt_int32_t read_chain(rule p_operand, bool (parser::*p_is_operator)() const, ku_after_t after,
                                        ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_arithmetic(rule           p_operand, bool (*p_is_operator)(ku_token_kind_t),
                                             ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_relation(uint8_t relation, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_like(bool negated, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_match(bool negated, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_in(bool negated, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_list(const char * p_at, bool negated, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_literal(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_name(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_column(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_field(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_subscript(ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t read_call(const function_name & name, ku_operand_t * p_result);
    [[nodiscard]] kt_int32_t apply_function(const function_name & name, const char * p_at, ku_operand_t * p_first,
                                            const ku_operand_t & second);
    [[nodiscard]] kt_int32_t apply_contains(const char * p_at, ku_operand_t * p_array, const ku_operand_t & value);

    // ---- Types ----
    [[nodiscard]] kt_int32_t check_number(const ku_operand_t & operand) const;
    [[nodiscard]] kt_int32_t make_comparable(const char * p_at, const char * p_operator, ku_operand_t * p_left,
                                             ku_operand_t * p_right);
    [[nodiscard]] kt_int32_t make_bytes(const char * p_at, ku_operand_t * p_operand);
    [[nodiscard]] kt_int32_t make_element_comparable(const char * p_at, ku_operand_t * p_value,
                                                     const ku_operand_t & array);
    [[nodiscard]] kt_int32_t ask(const ku_token_t & name, kt_uint32_t parent, ku_validate_data_t * p_data,
                                 bool * p_found);
    [[nodiscard]] kt_int32_t add_text(const ku_token_t & token, kt_uint32_t * p_offset, kt_uint32_t * p_length);

    bool is_or() const { return token_.kind == KU_TOKEN_OR_ELSE || ku_token_is_word(token_, "or"); }
    bool is_and() const { return token_.kind == KU_TOKEN_AND_ALSO || ku_token_is_word(token_, "and"); }
    bool is_followed_by_parenthesis() const
    {
        const char * p = p_next_;
        while (*p == ' ' || (*p >= '\t' && *p <= '\r'))
            p++;
        return *p == '(';
    }
    ku_operand_t new_operand(ku_expr_kind_t kind, const char * p_at) const
    {
        return {kind, KT_UNKNOWN, 0, false, code_.position(), ku_no_owner, p_at};
    }
    static void become_truth(ku_operand_t * p_operand)
    {
        *p_operand = {KU_KIND_INTEGER, KT_UNKNOWN, 0, true, p_operand->start, ku_no_owner, p_operand->p_at};
    }

    const char *             p_next_; // behind token_
    const char * const       p_end_;
    ku_validate_callback_t * p_callback_;
    void *                   p_callback_token_;
    ku_expr_trouble_t *      p_trouble_;
    ku_token_t               token_;
    ku_expr_code             code_;
    kt_uint32_t              depth_      = 0;
    uint32_t                 regex_work_ = ku_regex_work;
};

// ---- Tokens and trouble ----

kt_int32_t parser::refuse_syntax(const char * p_expected) const
{
    if (token_.kind == KU_TOKEN_END)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_SYNTAX, token_.p_start, "expected %s, found the end of the text",
                              p_expected);
    const shown_token found = shown(token_);
    return ku_expr_refuse(p_trouble_, KU_EXPR_E_SYNTAX, token_.p_start, "expected %s, found `%.*s`", p_expected,
                          found.length, found.p);
}

kt_int32_t parser::refuse_types(const char * p_at, const char * p_operator, const ku_operand_t & left,
                                const ku_operand_t & right) const
{
    return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, p_at, "`%s` cannot take %s and %s", p_operator,
                          ku_expr_kind_name(left.kind), ku_expr_kind_name(right.kind));
}

kt_int32_t parser::refuse_type(const char * p_at, const char * p_wanted, const ku_operand_t & operand) const
{
    return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, p_at, "%s, not %s", p_wanted, ku_expr_kind_name(operand.kind));
}

kt_int32_t parser::refuse_memory() const
{
    return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_MEMORY, token_.p_start, "there is no memory");
}

kt_int32_t parser::expect(ku_token_kind_t kind, const char * p_expected)
{
    return token_.kind == kind ? advance() : refuse_syntax(p_expected);
}

kt_int32_t parser::enter(const char * p_at)
{
    if (++depth_ > ku_expr_deepest_nesting)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TOO_LONG, p_at, "nested deeper than %u levels",
                              ku_expr_deepest_nesting);
    return 0;
}

// ---- Types ----

kt_int32_t parser::check_number(const ku_operand_t & operand) const
{
    return ku_expr_is_number(operand.kind) ? 0 : refuse_type(operand.p_at, "a condition must be a number", operand);
}

// A string literal beside a binary or a resource handle stands for bytes.
kt_int32_t parser::make_bytes(const char * p_at, ku_operand_t * p_operand)
{
    if (!p_operand->literal)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, p_at,
                              "a binary or a resource handle can only be compared with its like or with a literal");
    if (code_.failed())
        return refuse_memory();
    kt_uint32_t from = 0, length = 0;
    code_.text_of_literal(*p_operand, &from, &length);
    const size_t offset = code_.texts().count();
    uint8_t *    p_new  = code_.texts().add(length + 1u);
    if (p_new == nullptr)
        return refuse_memory();
    size_t count = 0;
    if (!ku_expr_bytes_of_literal(code_.texts().data() + from, length, p_new, &count))
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, p_operand->p_at,
                              "a literal that stands for bytes must have the form \"0x0a1f\" or that of $RH");
    code_.texts().truncate(offset + count);
    code_.replace_text(*p_operand, static_cast<kt_uint32_t>(offset), static_cast<kt_uint32_t>(count));
    p_operand->kind = KU_KIND_BINARY;
    return 0;
}

kt_int32_t parser::make_comparable(const char * p_at, const char * p_operator, ku_operand_t * p_left,
                                   ku_operand_t * p_right)
{
    if (ku_expr_is_number(p_left->kind) && ku_expr_is_number(p_right->kind))
        return 0;
    if (p_left->kind == KU_KIND_STRING && p_right->kind == KU_KIND_STRING)
        return 0;
    if (ku_expr_is_bytes(p_left->kind) && ku_expr_is_bytes(p_right->kind))
        return 0;
    if (ku_expr_is_bytes(p_left->kind) && p_right->kind == KU_KIND_STRING)
        return make_bytes(p_at, p_right);
    if (p_left->kind == KU_KIND_STRING && ku_expr_is_bytes(p_right->kind))
        return make_bytes(p_at, p_left);
    return refuse_types(p_at, p_operator, *p_left, *p_right);
}

kt_int32_t parser::make_element_comparable(const char * p_at, ku_operand_t * p_value, const ku_operand_t & array)
{
    ku_operand_t element = new_operand(ku_expr_kind_of_type(ku_expr_element_type(array.type)), array.p_at);
    element.start        = array.start;
    // Only the value may be a literal: an element never is, so that its place is not looked at.
    if (p_value->kind != KU_KIND_STRING && element.kind == KU_KIND_STRING)
        return refuse_types(p_at, "in", *p_value, element);
    return make_comparable(p_at, "in", p_value, &element);
}

// ---- || and && ----

kt_int32_t parser::read_expression(ku_operand_t * p_result)
{
    return read_chain(&parser::read_and, &parser::is_or, KU_AFTER_JUMP_IF_TRUE, p_result);
}

kt_int32_t parser::read_and(ku_operand_t * p_result)
{
    return read_chain(&parser::read_not, &parser::is_and, KU_AFTER_JUMP_IF_FALSE, p_result);
}

// An operand that is constant either leaves the chain or decides it; what stands behind it is checked and dropped.
kt_int32_t parser::read_chain(rule p_operand, bool (parser::*p_is_operator)() const, ku_after_t after,
                              ku_operand_t * p_result)
{
    if (const kt_int32_t rc = (this->*p_operand)(p_result); rc != 0)
        return rc;
    if (!(this->*p_is_operator)())
        return 0;
    const int    deciding = after == KU_AFTER_JUMP_IF_TRUE ? 1 : 0;
    ku_operand_t last     = *p_result;
    kt_uint32_t  chain    = ku_no_jump;
    bool         decided  = false;
    if (const kt_int32_t rc = check_number(last); rc != 0)
        return rc;
    while ((this->*p_is_operator)()) {
        if (!decided) {
            const int truth = code_.constant_truth(last);
            decided         = truth == deciding;
            if (truth < 0)
                code_.decide(last, after, &chain);
            else if (!decided)
                code_.drop(last);
        }
        if (const kt_int32_t rc = advance(); rc != 0)
            return rc;
        ku_operand_t next = {};
        if (const kt_int32_t rc = (this->*p_operand)(&next); rc != 0)
            return rc;
        if (const kt_int32_t rc = check_number(next); rc != 0)
            return rc;
        if (decided)
            code_.drop(next);
        else
            last = next;
    }
    code_.make_truth(last);
    if (chain != ku_no_jump)
        code_.end_chain(chain);
    become_truth(p_result);
    return 0;
}

kt_int32_t parser::read_not(ku_operand_t * p_result)
{
    if (token_.kind != KU_TOKEN_NOT)
        return read_comparison(p_result);
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = enter(p_at); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (const kt_int32_t rc = read_not(p_result); rc != 0)
        return rc;
    if (const kt_int32_t rc = check_number(*p_result); rc != 0)
        return rc;
    code_.invert(*p_result);
    become_truth(p_result);
    p_result->p_at = p_at;
    leave();
    return 0;
}

// ---- Comparisons ----

kt_int32_t parser::read_comparison(ku_operand_t * p_result)
{
    if (const kt_int32_t rc = read_bits(p_result); rc != 0)
        return rc;
    if (const uint8_t relation = relation_of(token_.kind); relation != 0)
        return read_relation(relation, p_result);
    if (token_.kind == KU_TOKEN_MATCH || token_.kind == KU_TOKEN_NO_MATCH)
        return read_match(token_.kind == KU_TOKEN_NO_MATCH, p_result);
    bool negated = false;
    if (ku_token_is_word(token_, "not")) {
        negated = true;
        if (const kt_int32_t rc = advance(); rc != 0)
            return rc;
    }
    if (ku_token_is_word(token_, "like"))
        return read_like(negated, p_result);
    if (ku_token_is_word(token_, "in"))
        return read_in(negated, p_result);
    return negated ? refuse_syntax("`like` or `in` behind `not`") : 0;
}

kt_int32_t parser::read_relation(uint8_t relation, ku_operand_t * p_result)
{
    const ku_token_t its_operator = token_;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    ku_operand_t right = {};
    if (const kt_int32_t rc = read_bits(&right); rc != 0)
        return rc;
    char shown_operator[3] = {};
    std::memcpy(shown_operator, its_operator.p_start, static_cast<size_t>(its_operator.p_end - its_operator.p_start));
    if (const kt_int32_t rc = make_comparable(its_operator.p_start, shown_operator, p_result, &right); rc != 0)
        return rc;
    if (ku_expr_is_bytes(p_result->kind) && relation != KU_EQ && relation != KU_NE)
        return refuse_types(its_operator.p_start, shown_operator, *p_result, right);
    code_.compare(relation, *p_result, right);
    become_truth(p_result);
    return 0;
}

kt_int32_t parser::read_like(bool negated, ku_operand_t * p_result)
{
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    ku_operand_t pattern = {};
    if (const kt_int32_t rc = read_bits(&pattern); rc != 0)
        return rc;
    if (p_result->kind != KU_KIND_STRING || pattern.kind != KU_KIND_STRING)
        return refuse_types(p_at, "like", *p_result, pattern);
    code_.like(*p_result, pattern, negated);
    become_truth(p_result);
    return 0;
}

kt_int32_t parser::read_match(bool negated, ku_operand_t * p_result)
{
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (token_.kind != KU_TOKEN_STRING)
        return refuse_syntax("a regular expression as a string literal");
    if (p_result->kind != KU_KIND_STRING)
        return refuse_type(p_at, "a regular expression is searched for in a string", *p_result);
    kt_uint32_t offset = 0, length = 0, program = 0;
    if (const kt_int32_t rc = add_text(token_, &offset, &length); rc != 0)
        return rc;
    if (code_.failed())
        return refuse_memory();
    // The literal is read while the texts grow, so it must not move: it gets a place of its own.
    ku_growable<uint8_t> literal;
    uint8_t *            p_literal = literal.add(length + 1u);
    if (p_literal == nullptr)
        return refuse_memory();
    std::memcpy(p_literal, code_.texts().data() + offset, length);
    code_.texts().truncate(offset);
    if (const kt_int32_t rc =
            ku_regex_compile(p_literal, length, token_.p_start, &regex_work_, &code_.texts(), &program, p_trouble_);
        rc != 0)
        return rc;
    if (code_.texts().count() > most_text_bytes)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TOO_LONG, token_.p_start, "the regular expressions are too large");
    code_.matches(program, negated);
    become_truth(p_result);
    return advance();
}

kt_int32_t parser::read_in(bool negated, ku_operand_t * p_result)
{
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (token_.kind == KU_TOKEN_OPEN)
        return read_list(p_at, negated, p_result);
    ku_operand_t array = {};
    if (const kt_int32_t rc = read_bits(&array); rc != 0)
        return rc;
    if (array.kind != KU_KIND_ARRAY)
        return refuse_type(array.p_at, "`in` needs an array or a list in parentheses", array);
    if (const kt_int32_t rc = make_element_comparable(p_at, p_result, array); rc != 0)
        return rc;
    code_.value_in_array(p_result->kind, ku_expr_element_type(array.type), negated);
    become_truth(p_result);
    return 0;
}

kt_int32_t parser::read_list(const char * p_at, bool negated, ku_operand_t * p_result)
{
    if (const kt_int32_t rc = enter(token_.p_start); rc != 0)
        return rc;
    kt_uint32_t chain = ku_no_jump;
    do {
        if (const kt_int32_t rc = advance(); rc != 0)
            return rc;
        ku_operand_t element = {};
        if (const kt_int32_t rc = read_bits(&element); rc != 0)
            return rc;
        if (const kt_int32_t rc = make_comparable(p_at, "in", p_result, &element); rc != 0)
            return rc;
        code_.list_element(p_result->kind, element, negated, &chain);
    } while (token_.kind == KU_TOKEN_COMMA);
    if (const kt_int32_t rc = expect(KU_TOKEN_CLOSE, "`,` or `)`"); rc != 0)
        return rc;
    code_.list_end(*p_result, negated, chain);
    become_truth(p_result);
    leave();
    return 0;
}

// ---- Arithmetic ----

bool is_bit_operator(ku_token_kind_t token)
{
    return token == KU_TOKEN_AND || token == KU_TOKEN_XOR || token == KU_TOKEN_OR;
}

bool is_sum_operator(ku_token_kind_t token)
{
    return token == KU_TOKEN_PLUS || token == KU_TOKEN_MINUS;
}

bool is_product_operator(ku_token_kind_t token)
{
    return token == KU_TOKEN_STAR || token == KU_TOKEN_SLASH || token == KU_TOKEN_PERCENT;
}

kt_int32_t parser::read_bits(ku_operand_t * p_result)
{
    return read_arithmetic(&parser::read_sum, is_bit_operator, p_result);
}

kt_int32_t parser::read_sum(ku_operand_t * p_result)
{
    return read_arithmetic(&parser::read_product, is_sum_operator, p_result);
}

kt_int32_t parser::read_product(ku_operand_t * p_result)
{
    return read_arithmetic(&parser::read_unary, is_product_operator, p_result);
}

kt_int32_t parser::read_arithmetic(rule p_operand, bool (*p_is_operator)(ku_token_kind_t), ku_operand_t * p_result)
{
    if (const kt_int32_t rc = (this->*p_operand)(p_result); rc != 0)
        return rc;
    while (p_is_operator(token_.kind)) {
        const ku_token_t its_operator      = token_;
        const char       shown_operator[2] = {*its_operator.p_start, '\0'};
        if (const kt_int32_t rc = advance(); rc != 0)
            return rc;
        ku_operand_t right = {};
        if (const kt_int32_t rc = (this->*p_operand)(&right); rc != 0)
            return rc;
        const bool integers = p_result->kind == KU_KIND_INTEGER && right.kind == KU_KIND_INTEGER;
        const bool bits     = is_bit_operator(its_operator.kind);
        if (!ku_expr_is_number(p_result->kind) || !ku_expr_is_number(right.kind) ||
            (!integers && (bits || its_operator.kind == KU_TOKEN_PERCENT)))
            return refuse_types(its_operator.p_start, shown_operator, *p_result, right);
        const bool unsigned_bits = bits && p_result->width != 0 && right.width != 0;
        p_result->kind           = code_.arithmetic(its_operator.kind, *p_result, right);
        p_result->width          = unsigned_bits ? std::max(p_result->width, right.width) : uint8_t{0};
        p_result->truth          = false;
    }
    return 0;
}

kt_int32_t parser::read_unary(ku_operand_t * p_result)
{
    const ku_token_t its_operator = token_;
    if (!is_sum_operator(token_.kind) && token_.kind != KU_TOKEN_TILDE)
        return read_primary(p_result);
    if (const kt_int32_t rc = enter(token_.p_start); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (const kt_int32_t rc = read_unary(p_result); rc != 0)
        return rc;
    leave();
    p_result->p_at = its_operator.p_start;
    if (!ku_expr_is_number(p_result->kind))
        return refuse_type(its_operator.p_start, "a sign stands before a number", *p_result);
    if (its_operator.kind == KU_TOKEN_PLUS) {
        p_result->truth = false;
        return 0;
    }
    if (its_operator.kind == KU_TOKEN_MINUS) {
        code_.negate(*p_result);
        p_result->width = 0;
    } else if (p_result->kind != KU_KIND_INTEGER) {
        return refuse_type(its_operator.p_start, "`~` takes an integer", *p_result);
    } else {
        code_.complement(*p_result);
    }
    p_result->truth = false;
    return 0;
}

// ---- Values ----

kt_int32_t parser::read_primary(ku_operand_t * p_result)
{
    switch (token_.kind) {
    case KU_TOKEN_INTEGER:
    case KU_TOKEN_FLOATING:
    case KU_TOKEN_STRING:
        return read_literal(p_result);
    case KU_TOKEN_NAME:
        return read_name(p_result);
    case KU_TOKEN_OPEN:
        break;
    default:
        return refuse_syntax("a value");
    }
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = enter(p_at); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (const kt_int32_t rc = read_expression(p_result); rc != 0)
        return rc;
    if (const kt_int32_t rc = expect(KU_TOKEN_CLOSE, "an operator or `)`"); rc != 0)
        return rc;
    p_result->p_at = p_at;
    leave();
    return 0;
}

kt_int32_t parser::add_text(const ku_token_t & token, kt_uint32_t * p_offset, kt_uint32_t * p_length)
{
    const size_t offset = code_.texts().count();
    uint8_t *    p_new  = code_.texts().add(static_cast<size_t>(token.p_end - token.p_start));
    if (p_new == nullptr)
        return refuse_memory();
    const size_t length = ku_expr_decode_string(token, reinterpret_cast<char *>(p_new));
    code_.texts().truncate(offset + length);
    *p_offset = static_cast<kt_uint32_t>(offset);
    *p_length = static_cast<kt_uint32_t>(length);
    return 0;
}

kt_int32_t parser::read_literal(ku_operand_t * p_result)
{
    if (token_.kind == KU_TOKEN_STRING) {
        kt_uint32_t offset = 0, length = 0;
        if (const kt_int32_t rc = add_text(token_, &offset, &length); rc != 0)
            return rc;
        *p_result         = new_operand(KU_KIND_STRING, token_.p_start);
        p_result->literal = true;
        code_.push_text(offset, length);
    } else if (token_.kind == KU_TOKEN_INTEGER) {
        *p_result = new_operand(KU_KIND_INTEGER, token_.p_start);
        code_.push_integer(token_.integer);
    } else {
        *p_result = new_operand(KU_KIND_FLOATING, token_.p_start);
        code_.push_floating(token_.floating);
    }
    return advance();
}

kt_int32_t parser::read_name(ku_operand_t * p_result)
{
    if (!is_followed_by_parenthesis())
        return read_column(p_result);
    const size_t length = static_cast<size_t>(token_.p_end - token_.p_start);
    for (const function_name & name : functions) {
        if (std::strlen(name.p_name) == length && std::memcmp(name.p_name, token_.p_start, length) == 0)
            return read_call(name, p_result);
    }
    const shown_token found = shown(token_);
    return ku_expr_refuse(p_trouble_, KU_EXPR_E_SYNTAX, token_.p_start, "no function named \"%.*s\"", found.length,
                          found.p);
}

// Asks the callback about a name, which gets its terminator in the texts for the while.
kt_int32_t parser::ask(const ku_token_t & name, kt_uint32_t parent, ku_validate_data_t * p_data, bool * p_found)
{
    const size_t offset = code_.texts().count();
    const size_t length = static_cast<size_t>(name.p_end - name.p_start);
    uint8_t *    p_new  = code_.texts().add(length + 1);
    if (p_new == nullptr)
        return refuse_memory();
    std::memcpy(p_new, name.p_start, length);
    p_new[length] = '\0';
    *p_data       = {KT_UNKNOWN, 0};
    *p_found = p_callback_(p_callback_token_, reinterpret_cast<kt_char_t *>(p_new), static_cast<kt_uint32_t>(length),
                           parent, p_data) == 0;
    code_.texts().truncate(offset);
    return 0;
}

kt_int32_t parser::read_column(ku_operand_t * p_result)
{
    const ku_token_t   name  = token_;
    ku_validate_data_t data  = {};
    bool               found = false;
    if (const kt_int32_t rc = ask(name, top_level, &data, &found); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    const shown_token shown_name = shown(name);
    if (!found) {
        const bool is_infinity = shown_name.length == 3 && std::memcmp(name.p_start, "inf", 3) == 0;
        const bool is_nan      = shown_name.length == 3 && std::memcmp(name.p_start, "nan", 3) == 0;
        if (!is_infinity && !is_nan)
            return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_SUCH_NAME, name.p_start, "no column named \"%.*s\"",
                                  shown_name.length, shown_name.p);
        *p_result = new_operand(KU_KIND_FLOATING, name.p_start);
        code_.push_floating(is_infinity ? std::numeric_limits<double>::infinity()
                                        : std::numeric_limits<double>::quiet_NaN());
        return 0;
    }
    *p_result       = new_operand(ku_expr_kind_of_type(data.type), name.p_start);
    p_result->type  = data.type;
    p_result->width = static_cast<uint8_t>(ku_expr_unsigned_width(data.type));
    p_result->owner = data.type == KT_SD_PTR || data.type == KT_SD_PTR_ARRAY ? data.id : ku_no_owner;
    if (p_result->kind == KU_KIND_OPAQUE)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, name.p_start,
                              "the column \"%.*s\" has a type that no operator takes", shown_name.length, shown_name.p);
    if (data.id == UINT32_MAX)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_SUCH_NAME, name.p_start, "no column named \"%.*s\"",
                              shown_name.length, shown_name.p);
    code_.push_column(data.type, data.id);
    while (token_.kind == KU_TOKEN_DOT || token_.kind == KU_TOKEN_OPEN_BRACKET) {
        const kt_int32_t rc = token_.kind == KU_TOKEN_DOT ? read_field(p_result) : read_subscript(p_result);
        if (rc != 0)
            return rc;
    }
    return 0;
}

kt_int32_t parser::read_field(ku_operand_t * p_result)
{
    const char * p_dot = token_.p_start;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    if (token_.kind != KU_TOKEN_NAME)
        return refuse_syntax("the name of a field");
    if (p_result->kind != KU_KIND_STRUCTURE)
        return refuse_type(p_dot, "only structured data has fields", *p_result);
    ku_validate_data_t data       = {};
    bool               found      = false;
    const shown_token  shown_name = shown(token_);
    if (p_result->owner != ku_no_owner) {
        if (const kt_int32_t rc = ask(token_, p_result->owner, &data, &found); rc != 0)
            return rc;
    }
    if (!found)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_NO_SUCH_NAME, token_.p_start, "no field named \"%.*s\"",
                              shown_name.length, shown_name.p);
    p_result->kind  = ku_expr_kind_of_type(data.type);
    p_result->type  = data.type;
    p_result->width = static_cast<uint8_t>(ku_expr_unsigned_width(data.type));
    p_result->owner = ku_no_owner; // the fields of a structure inside a structure have no names
    if (p_result->kind == KU_KIND_OPAQUE)
        return ku_expr_refuse(p_trouble_, KU_EXPR_E_TYPES, token_.p_start,
                              "the field \"%.*s\" has a type that no operator takes", shown_name.length, shown_name.p);
    code_.field(data.type, data.id);
    return advance();
}

kt_int32_t parser::read_subscript(ku_operand_t * p_result)
{
    const char * p_bracket = token_.p_start;
    if (p_result->kind != KU_KIND_ARRAY)
        return refuse_type(p_bracket, "only an array has elements", *p_result);
    if (const kt_int32_t rc = enter(p_bracket); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    ku_operand_t index = {};
    if (const kt_int32_t rc = read_bits(&index); rc != 0)
        return rc;
    if (index.kind != KU_KIND_INTEGER)
        return refuse_type(index.p_at, "an index must be an integer", index);
    if (const kt_int32_t rc = expect(KU_TOKEN_CLOSE_BRACKET, "an operator or `]`"); rc != 0)
        return rc;
    p_result->type  = ku_expr_element_type(p_result->type);
    p_result->kind  = ku_expr_kind_of_type(p_result->type);
    p_result->width = static_cast<uint8_t>(ku_expr_unsigned_width(p_result->type));
    code_.element(p_result->type);
    leave();
    return 0;
}

// ---- Functions ----

kt_int32_t parser::read_call(const function_name & name, ku_operand_t * p_result)
{
    const char * p_at = token_.p_start;
    if (const kt_int32_t rc = enter(p_at); rc != 0)
        return rc;
    if (const kt_int32_t rc = advance(); rc != 0) // the name
        return rc;
    ku_operand_t second    = {};
    unsigned     arguments = 0;
    do {
        if (const kt_int32_t rc = advance(); rc != 0)
            return rc;
        if (arguments == name.arguments)
            return ku_expr_refuse(p_trouble_, KU_EXPR_E_SYNTAX, token_.p_start, "`%s` takes %u argument%s", name.p_name,
                                  name.arguments, name.arguments == 1 ? "" : "s");
        if (const kt_int32_t rc = read_expression(arguments == 0 ? p_result : &second); rc != 0)
            return rc;
        arguments++;
    } while (token_.kind == KU_TOKEN_COMMA);
    if (arguments < name.arguments)
        return refuse_syntax("`,` and a second argument");
    if (const kt_int32_t rc = expect(KU_TOKEN_CLOSE, "an operator or `)`"); rc != 0)
        return rc;
    if (const kt_int32_t rc = apply_function(name, p_at, p_result, second); rc != 0)
        return rc;
    p_result->p_at = p_at;
    leave();
    return 0;
}

kt_int32_t parser::apply_function(const function_name & name, const char * p_at, ku_operand_t * p_first,
                                  const ku_operand_t & second)
{
    const ku_operand_t argument = *p_first;
    switch (name.which) {
    case function::length:
        if (argument.kind != KU_KIND_STRING && argument.kind != KU_KIND_BINARY)
            return refuse_type(p_at, "`length` takes a string or a binary", argument);
        *p_first = {KU_KIND_INTEGER, KT_UNKNOWN, 0, false, argument.start, ku_no_owner, p_at};
        code_.length();
        return 0;
    case function::count:
        if (argument.kind != KU_KIND_ARRAY && argument.kind != KU_KIND_STRUCTURE)
            return refuse_type(p_at, "`count` takes an array or structured data", argument);
        *p_first = {KU_KIND_INTEGER, KT_UNKNOWN, 0, false, argument.start, ku_no_owner, p_at};
        code_.count();
        return 0;
    case function::lower:
    case function::upper:
        if (argument.kind != KU_KIND_STRING)
            return refuse_type(
                p_at, name.which == function::lower ? "`lower` takes a string" : "`upper` takes a string", argument);
        p_first->literal = false;
        code_.letters(name.which == function::lower ? KU_LETTERS_LOWER : KU_LETTERS_UPPER);
        return 0;
    default:
        return apply_contains(p_at, p_first, second);
    }
}

kt_int32_t parser::apply_contains(const char * p_at, ku_operand_t * p_array, const ku_operand_t & value)
{
    if (p_array->kind != KU_KIND_ARRAY)
        return refuse_type(p_at, "`contains` takes an array and a value", *p_array);
    ku_operand_t its_value = value;
    if (const kt_int32_t rc = make_element_comparable(p_at, &its_value, *p_array); rc != 0)
        return rc;
    code_.array_has_value(its_value.kind, ku_expr_element_type(p_array->type));
    become_truth(p_array);
    return 0;
}

// ---- The whole ----

kt_int32_t parser::parse(ku_program_t ** p_p_program)
{
    if (const kt_int32_t rc = advance(); rc != 0)
        return rc;
    ku_operand_t result = {};
    if (const kt_int32_t rc = read_expression(&result); rc != 0)
        return rc;
    if (token_.kind != KU_TOKEN_END)
        return refuse_syntax("an operator");
    if (const kt_int32_t rc = check_number(result); rc != 0)
        return rc;
    code_.make_truth(result);
    return code_.finish(p_p_program) == 0 ? 0 : refuse_memory();
}

// The place of the first byte that isn't part of a character, or NULL.
const char * find_malformed(const char * p_text, const char * p_end)
{
    const auto * p        = reinterpret_cast<const uint8_t *>(p_text);
    const auto * p_behind = reinterpret_cast<const uint8_t *>(p_end);
    while (p < p_behind) {
        uint32_t     character = 0;
        const size_t length    = ku_utf8_read(p, p_behind, &character);
        if (length == 0)
            return reinterpret_cast<const char *>(p);
        p += length;
    }
    return nullptr;
}

} // namespace

kt_int32_t ku_expr_compile(const char * p_text, const char * p_end, ku_validate_callback_t * p_callback, void * p_token,
                           ku_program_t ** p_p_program, ku_expr_trouble_t * p_trouble)
{
    if (const char * p_malformed = find_malformed(p_text, p_end); p_malformed != nullptr)
        return ku_expr_refuse(p_trouble, KU_EXPR_E_SYNTAX, p_malformed, "the byte 0x%02x, which isn't UTF-8 text",
                              static_cast<unsigned>(static_cast<unsigned char>(*p_malformed)));
    return parser(p_text, p_end, p_callback, p_token, p_trouble).parse(p_p_program);
}
