// SPDX-License-Identifier: MIT
// ku_expr_code: the program under construction. Internal to the selection language.
//
// The parser calls these functions in the order of the text, operands before their operator, with types that fit. What
// can be computed now is folded into a constant, and a comparison of a column with constants becomes one instruction.
// Always holds: instructions below the barrier are the target of a jump or lie before one, and are not changed any
// more. Failure: only for want of memory. It sticks: later calls do nothing, and finish() reports it.
#pragma once

#include "ku_expr.h"
#include "ku_growable.h"

inline constexpr kt_uint32_t ku_no_owner = UINT32_MAX;
inline constexpr kt_uint32_t ku_no_jump  = UINT32_MAX;

// A part of the text whose value lies at the top of the stack.
struct ku_operand_t {
    ku_expr_kind_t kind;
    kt_data_type_t type;            // of a column, element or field; KT_UNKNOWN if computed
    uint8_t        width;           // of an unsigned value with a width of its own: 32 or 64; else 0
    bool           truth;           // an integer that is 0 or 1
    kt_uint32_t    start;           // its first instruction
    kt_uint32_t    owner;           // the column whose fields it has, or ku_no_owner
    const char *   p_at;            // where it starts in the text
    bool           literal = false; // a string literal, which may stand for bytes
};

class ku_expr_code
{
  public:
    // ---- Values ----
    void push_integer(ku_int_t value);
    void push_floating(double value);
    void push_text(kt_uint32_t offset, kt_uint32_t length);
    void push_column(kt_data_type_t type, kt_uint32_t column);
    void field(kt_data_type_t type, kt_uint32_t field);
    void element(kt_data_type_t type);
    void count();
    void length();
    void letters(ku_letters_t letters);

    // ---- Numbers ----
    // Returns the kind of the result. The token is the operator.
    ku_expr_kind_t arithmetic(ku_token_kind_t token, const ku_operand_t & left, const ku_operand_t & right);
    void           negate(const ku_operand_t & operand);
    void           complement(const ku_operand_t & operand);

    // ---- Tests ----
    void compare(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right);
    void like(const ku_operand_t & left, const ku_operand_t & right, bool negated);
    void matches(kt_uint32_t regex_offset, bool negated);
    void value_in_array(ku_expr_kind_t value_kind, kt_data_type_t element_type, bool negated);
    void array_has_value(ku_expr_kind_t value_kind, kt_data_type_t element_type);
    void invert(const ku_operand_t & operand);

    // ---- Lists: the value, and then for each element its instructions and list_element() ----
    void list_element(ku_expr_kind_t value_kind, const ku_operand_t & element, bool negated, kt_uint32_t * p_chain);
    void list_end(const ku_operand_t & value, bool negated, kt_uint32_t chain);

    // ---- Chains of && or || ----
    // What the operand is worth, if that is known now: 0, 1, or -1 if it isn't.
    int constant_truth(const ku_operand_t & operand) const;
    // The operand decides the chain if it is false (&&) or true (||), and otherwise leaves nothing.
    void decide(const ku_operand_t & operand, ku_after_t after, kt_uint32_t * p_chain);
    void make_truth(const ku_operand_t & operand);
    void end_chain(kt_uint32_t chain);
    // Forgets what was built from the operand's start on: it can't be reached.
    void drop(const ku_operand_t & operand);

    // ---- A string literal's text ----
    void text_of_literal(const ku_operand_t & literal, kt_uint32_t * p_offset, kt_uint32_t * p_length) const;
    void replace_text(const ku_operand_t & literal, kt_uint32_t offset, kt_uint32_t length);

    // Lays everything into one block.
    [[nodiscard]] kt_int32_t finish(ku_program_t ** p_p_program);

    bool                   failed() const { return failed_; }
    void                   set_failed() { failed_ = true; }
    kt_uint32_t            position() const { return static_cast<kt_uint32_t>(code_.count()); }
    ku_growable<uint8_t> & texts() { return texts_; }

  private:
    void          emit(ku_operation_t operation, unsigned detail, kt_uint32_t operand, int stack_effect);
    void          emit_constant(ku_operation_t operation, const ku_constant_t & constant);
    void          emit_column_test(ku_operation_t operation, unsigned detail, kt_uint32_t column,
                                   const ku_constant_t & constant);
    void          emit_truth(bool value);
    ku_constant_t literal_at(kt_uint32_t offset, kt_uint32_t length) const; // for a test of a column
    void          truncate(kt_uint32_t start, kt_uint32_t values);
    void          seal();
    bool          is_alone(kt_uint32_t start, kt_uint32_t end) const;
    bool          is_constant(kt_uint32_t start, kt_uint32_t end) const;
    bool          is_column(kt_uint32_t start, kt_uint32_t end) const;
    void          link_jump(kt_uint32_t instruction, kt_uint32_t * p_chain);
    void          to_floating(const ku_operand_t & left, const ku_operand_t & right);
    bool fold_integers(ku_int_operation_t * p_operation, const ku_operand_t & left, const ku_operand_t & right);
    bool fold_floatings(ku_operation_t operation, const ku_operand_t & left, const ku_operand_t & right);
    bool fold_comparison(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right);
    bool fuse_comparison(uint8_t relation, const ku_operand_t & left, const ku_operand_t & right);
    void test_column(const ku_instruction_t & column, uint8_t relation, const ku_instruction_t & constant);
    void test_integer_column(const ku_instruction_t & column, uint8_t relation, const ku_instruction_t & constant);
    void test_floating_column(const ku_instruction_t & column, uint8_t relation, const ku_instruction_t & constant);
    bool fuse_list(const ku_operand_t & value, bool negated);
    bool is_list_of_constants(const ku_operand_t & value) const;
    bool member_of_list(kt_data_type_t column_type, const ku_instruction_t & element, ku_constant_t * p_member) const;
    const ku_constant_t & constant_of(kt_uint32_t instruction) const { return constants_[code_[instruction].constant]; }

    ku_growable<ku_instruction_t> code_;
    ku_growable<ku_constant_t>    constants_;
    ku_growable<uint8_t>          texts_;
    kt_uint32_t                   barrier_        = 0;
    kt_uint32_t                   depth_          = 0; // values on the stack
    kt_uint32_t                   deepest_        = 0;
    kt_uint32_t                   columns_needed_ = 0;
    bool                          failed_         = false;
};
