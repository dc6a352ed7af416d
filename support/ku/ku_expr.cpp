// SPDX-License-Identifier: MIT
// ku_expr: the calls of the selection language.
//
// Locking: none. A diagnosis belongs to the thread that got it; a compiled expression is read-only.
#include "ku_expr.h"
#include "ku_expr_tests.h"
#include "ku_thread_buffer.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace
{

// What the thread's last compilation has to say; NULL: nothing, it succeeded.
__attribute__((tls_model("initial-exec"))) thread_local constinit const kt_char_t * P_Diagnosis = nullptr;

constexpr kt_char_t without_place[] = "the expression is wrong, and there is no memory to say where";

struct text_place {
    size_t line;
    size_t column;
    bool   has_several_lines;
};

// Counts lines, and characters in the line, up to a place in the text. Bytes that aren't the first of a character don't
// count.
text_place place_of(const char * p_text, const char * p_at, const char * p_end)
{
    text_place place = {1, 1, false};
    for (const char * p = p_text; p < p_at; p++) {
        if (*p == '\n') {
            place.line++;
            place.column = 1;
        } else if ((*p & 0xC0) != 0x80) {
            place.column++;
        }
    }
    place.has_several_lines = std::memchr(p_text, '\n', static_cast<size_t>(p_end - p_text)) != nullptr;
    return place;
}

[[nodiscard]] kt_int32_t diagnose(const char * p_text, const char * p_end, const ku_expr_trouble_t & trouble)
{
    ku_thread_buffer_t * p_buffer = ku_thread_buffer();
    if (p_buffer == nullptr) {
        P_Diagnosis = without_place;
        return trouble.code;
    }
    const text_place place  = place_of(p_text, trouble.p_at, p_end);
    char *           p_to   = p_buffer->diagnosis;
    constexpr size_t room   = ku_thread_buffer_t::diagnosis_size;
    const int        length = place.has_several_lines
                                  ? snprintf(p_to, room, "line %zu, column %zu: %s", place.line, place.column, trouble.text)
                                  : snprintf(p_to, room, "column %zu: %s", place.column, trouble.text);
    if (length < 0)
        *p_to = '\0';
    P_Diagnosis = p_to;
    return trouble.code;
}

} // namespace

extern "C" kt_int32_t ku_comp_expr_1(kt_char_ptr_t p_text, kt_uint32_t, ku_validate_callback_t callback, void * token,
                                     void ** p_p_compiled)
{
    P_Diagnosis               = nullptr;
    ku_expr_trouble_t trouble = {};
    if (p_text == nullptr || callback == nullptr || p_p_compiled == nullptr) {
        const char * p_nothing = "";
        (void)ku_expr_refuse(&trouble, KU_EXPR_E_SYNTAX, p_nothing,
                             "there is no text, callback or place for the result");
        return diagnose(p_nothing, p_nothing, trouble);
    }
    const char * p_end = p_text + strnlen(p_text, ku_expr_longest_text + 1);
    if (static_cast<size_t>(p_end - p_text) > ku_expr_longest_text) {
        (void)ku_expr_refuse(&trouble, KU_EXPR_E_TOO_LONG, p_text, "the text is longer than 1 MiB");
        return diagnose(p_text, p_end, trouble);
    }
    ku_program_t * p_program = nullptr;
    if (ku_expr_compile(p_text, p_end, callback, token, &p_program, &trouble) != 0)
        return diagnose(p_text, p_end, trouble);
    *p_p_compiled = p_program;
    return 0;
}

extern "C" kt_int32_t ku_exec_expr_within_1(void * p_compiled, kt_uint32_t, const void * p_values,
                                            kt_uint32_t total_values, kt_uint32_t * p_result,
                                            const void * p_indirect_data, kt_uint32_t indirect_length)
{
    const auto * p_program = static_cast<const ku_program_t *>(p_compiled);
    if (p_program == nullptr || p_result == nullptr || (p_values == nullptr && p_program->columns_needed != 0))
        return KU_EXPR_E_SYNTAX;
    if (p_program->columns_needed > total_values)
        return KU_EXPR_E_NO_SUCH_ELEMENT;
    if (p_indirect_data == nullptr)
        indirect_length = 0;
    const ku_row_t row = {static_cast<const uint8_t *>(p_values),
                          {static_cast<const uint8_t *>(p_indirect_data), indirect_length}};
    return ku_expr_run(*p_program, p_program->instructions(), row, p_result);
}

extern "C" kt_int32_t ku_exec_expr_on_rows_1(void * p_compiled, kt_uint32_t, const ku_row_form_t * p_form,
                                             const void * const * p_p_rows, kt_uint64_t rows, kt_uint64_t * p_matching)
{
    const auto * p_program = static_cast<const ku_program_t *>(p_compiled);
    if (p_program == nullptr || p_form == nullptr || p_p_rows == nullptr || p_matching == nullptr)
        return KU_EXPR_E_SYNTAX;
    const bool has_all_columns = p_program->columns_needed <= p_form->total_values;
    *p_matching                = has_all_columns ? ku_expr_run_on_rows(*p_program, *p_form, p_p_rows, rows) : 0;
    return 0;
}

extern "C" kt_int32_t ku_exec_expr_1(void * p_compiled, kt_uint32_t flags, const void * p_values,
                                     kt_uint32_t total_values, kt_uint32_t * p_result, const void * p_indirect_data)
{
    return ku_exec_expr_within_1(p_compiled, flags, p_values, total_values, p_result, p_indirect_data, 0xFFFFFFFF);
}

extern "C" void ku_free_expr_1(void * p_compiled, kt_uint32_t)
{
    std::free(p_compiled);
}

extern "C" const kt_char_t * ku_expr_diagnosis_1(void)
{
    // At the thread's end the buffer goes before the last ones who could ask.
    if (P_Diagnosis == nullptr || (P_Diagnosis != without_place && !ku_thread_has_buffer()))
        return "";
    return P_Diagnosis;
}
