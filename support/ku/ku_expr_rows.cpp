// SPDX-License-Identifier: MIT
// ku_expr_rows: runs a program on many rows.
//
// A chain of && or || that begins with tests of columns is run test by test, each on all rows that the tests ahead of it
// haven't decided: so a test is looked up once, and a row that goes either way is no branch to be guessed. Where the
// chain goes on with something else, the machine runs the rest on each row that is left.
// Always holds: what comes out for a row is what the machine alone would find, since rows don't see each other.
#include "ku_expr.h"
#include "ku_expr_tests.h"

#include <bit>

namespace
{

// Sets of rows are words with a bit for each.
using row_set_t = uint64_t;

struct rows_t {
    const ku_row_form_t & form;
    const void * const *  p_p_rows;

    ku_row_t operator[](size_t i) const
    {
        const auto * const p      = static_cast<const uint8_t *>(p_p_rows[i]);
        const kt_uint32_t  length = ku_load<kt_uint32_t>(p + form.length_offset);
        return {p + form.values_offset,
                {p + form.indirect_offset, length > form.length_excess ? length - form.length_excess : 0}};
    }
};

template <class Visit> void for_each(row_set_t set, Visit && visit)
{
    for (; set != 0; set &= set - 1)
        visit(static_cast<size_t>(std::countr_zero(set)));
}

// What a test has found.
struct findings_t {
    row_set_t truths;
    row_set_t damaged;
};

template <ku_operation_t Operation>
findings_t test_rows(const ku_program_t & program, const ku_instruction_t & instruction, const rows_t & rows,
                     row_set_t set)
{
    const ku_column_test_t<Operation> test(program, instruction);
    findings_t                        found = {};
    for_each(set, [&](size_t i) {
        const row_set_t finding = test(rows[i]);
        found.truths |= (finding & KU_FOUND_TRUE) << i;
        found.damaged |= (finding & KU_FOUND_DAMAGED) / KU_FOUND_DAMAGED << i;
    });
    return found;
}

findings_t test_rows(const ku_program_t & program, const ku_instruction_t & instruction, const rows_t & rows,
                     row_set_t set)
{
    switch (instruction.operation) {
#define KU_COLUMN_TEST(operation)                                                                                      \
    case operation:                                                                                                    \
        return test_rows<operation>(program, instruction, rows, set);
        KU_FOR_EACH_COLUMN_TEST(KU_COLUMN_TEST)
#undef KU_COLUMN_TEST
    default:
        __builtin_unreachable();
    }
}

// Whether the instruction tests a column, and what it decides is decided for the whole program.
bool decides(const ku_program_t & program, const ku_instruction_t & instruction)
{
    if (!ku_operation_is_column_test(instruction.operation))
        return false;
    const bool is_last = instruction.after == KU_AFTER_PUSH;
    return (is_last ? &instruction + 1 : program.instructions() + instruction.target)->operation == KU_OP_END;
}

} // namespace

uint64_t ku_expr_run_on_rows(const ku_program_t & program, const ku_row_form_t & form, const void * const * p_p_rows,
                             uint64_t set)
{
    const rows_t             rows      = {form, p_p_rows};
    row_set_t                undecided = set, matching = 0;
    const ku_instruction_t * p = program.instructions();
    for (; undecided != 0 && decides(program, *p); p++) {
        const findings_t found  = test_rows(program, *p, rows, undecided);
        const row_set_t  whole  = undecided & ~found.damaged;
        const row_set_t  truths = p->negated != 0 ? whole & ~found.truths : found.truths;
        if (p->after != KU_AFTER_JUMP_IF_FALSE)
            matching |= truths;
        undecided = p->after == KU_AFTER_JUMP_IF_FALSE  ? truths
                    : p->after == KU_AFTER_JUMP_IF_TRUE ? whole & ~truths
                                                        : 0;
    }
    for_each(undecided, [&](size_t i) {
        kt_uint32_t result = 0;
        if (ku_expr_run(program, p, rows[i], &result) == 0)
            matching |= static_cast<row_set_t>(result) << i;
    });
    return matching;
}
