// SPDX-License-Identifier: MIT
// rg_i_criteria: selection criteria: from a caller's format and values to text, from text to a compiled expression, and
// the walk over the rows that match it.
#pragma once

#include <cstdarg>

#include "frame/rg_i_guards.h"
#include "rg_i_row_walk.h"
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

    // Which rows of the group match. One whose evaluation faults doesn't, nor does one without a record to judge it by.
    [[nodiscard]] kt_int32_t look_at(const rg_i_row_group_t & group, kt_uint64_t * p_matching) const
    {
        *p_matching = group.rows;
        if (p_compiled_ == nullptr)
            return 0;
        const kt_int32_t result =
            ku_exec_expr_on_rows_1(p_compiled_, evaluation_flags, &form_,
                                   reinterpret_cast<const void * const *>(group.records), group.judged, p_matching);
        return result == 0 ? 0 : fail(result);
    }

  private:
    static constexpr kt_uint32_t evaluation_flags = 16;

    [[nodiscard]] static kt_int32_t fail(kt_int32_t result);

    void *        p_compiled_ = nullptr;
    ku_row_form_t form_       = {};
};

// Visits each row that has a record in the role, and of which the criteria are true when it is judged by its record in
// the other role, with its slot and that record.
template <class Visit>
[[nodiscard]] kt_int32_t rg_i_walk_matching_rows(const rg_i_table_t * p_table, row_role role, row_role judged_role,
                                                 const rg_i_criteria & criteria, Visit && visit)
{
    return rg_i_walk_row_groups(p_table, role, judged_role, [&](const rg_i_row_group_t & group) -> kt_int32_t {
        kt_uint64_t matching = 0;
        if (const kt_int32_t rc = criteria.look_at(group, &matching); rc != 0)
            return rc;
        return rg_i_visit_rows(group, matching, visit);
    });
}
