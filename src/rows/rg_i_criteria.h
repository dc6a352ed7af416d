// SPDX-License-Identifier: MIT
// rg_i_criteria: selection criteria: from a caller's format and values to text, from text to a compiled expression, and
// the question whether a row matches it.
#pragma once

#include <cstdarg>

#include "frame/rg_i_guards.h"
#include "rg_i_table.h"

// Renders the format with the values of ap. *result comes back with the text, which the caller frees, also after a
// failure (then it is what was rendered so far, or NULL).
[[nodiscard]] kt_int32_t rg_i_select_printf(kt_char_ptr_t * result, kt_char_ptr_t selectionCriteria, va_list ap);
// The text's growth and append step. *to stands *currentResultBytes behind *result. A NULL buffer makes room and
// appends nothing. A failure frees the text.
[[nodiscard]] kt_int32_t rg_i_append_buffer_to_result(kt_uint32_t * currentResultBytes, kt_uint32_t * maxResultBytes,
                                                      kt_uint32_t length, kt_char_ptr_t * result, kt_char_ptr_t * to,
                                                      const kt_char_t * buffer);

[[nodiscard]] kt_int32_t rg_i_compile_expression(kt_char_ptr_t p_selection_criteria, rg_i_table_t * p_table,
                                                 void **      p_compiled_expression,
                                                 ku_iconv_t * p_string_conversion_handle);
kt_int32_t rg_i_validate_column_callback(void * token, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t parent_id,
                                         ku_validate_data_t * p_return_data);

// The criteria of one call, compiled; without a text every row matches.
class rg_i_criteria
{
  public:
    rg_i_criteria() = default;
    ~rg_i_criteria()
    {
        if (p_compiled_ != nullptr)
            ku_free_expr_1(p_compiled_, 0);
    }
    rg_i_criteria(const rg_i_criteria &)             = delete;
    rg_i_criteria & operator=(const rg_i_criteria &) = delete;

    // With the handle of the table's tree, or none for a table without one.
    [[nodiscard]] kt_int32_t compile(kt_char_ptr_t p_selection_criteria, rg_i_table_t * p_table);

    // A row whose evaluation faults doesn't match. A NULL record is one that nothing can be asked of.
    [[nodiscard]] kt_int32_t look_at(const kt_char_t * p_record, bool * p_matches) const
    {
        *p_matches = true;
        if (p_compiled_ == nullptr)
            return 0;
        *p_matches = false;
        if (p_record == nullptr)
            return 0;
        kt_uint32_t      row_matches = 0;
        const kt_int32_t result = ku_exec_expr_within_1(p_compiled_, evaluation_flags, p_record + sizeof(kt_uint32_t),
                                                        total_columns_, &row_matches, p_record + fixed_length_,
                                                        rg_i_record_data_length(p_record) - fixed_length_);
        if (result != 0)
            return settle(result);
        *p_matches = row_matches != 0;
        return 0;
    }

  private:
    static constexpr kt_uint32_t evaluation_flags = 16;

    [[nodiscard]] static kt_int32_t settle(kt_int32_t result);

    void *      p_compiled_    = nullptr;
    kt_uint32_t total_columns_ = 0;
    kt_uint32_t fixed_length_  = 0;
};
