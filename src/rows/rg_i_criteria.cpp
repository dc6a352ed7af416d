// SPDX-License-Identifier: MIT
// rg_i_criteria: compiles rendered criteria against a table's columns, and asks rows whether they match.
//
// Layer: rows. Stands on the selection language of the utility library, which asks back what a name stands for.
// Always holds: a compiled expression belongs to the one call that made it, and goes with it.
// Locking: the caller holds the table's lock, for as long as it uses the criteria.
// Failure: nothing is left.
#include "rows/rg_i_criteria.h"

#include <cstring>

#include "frame/rg_i_trace.h"

namespace
{

constexpr char module_version[] = "rg_i_criteria 1.0";

constexpr kt_uint32_t no_parent = 0xFFFFFFFF;
constexpr kt_int32_t  no_such   = -1;

// A field of a packed structured data definition: a count, and then for each field its type and its name.
[[nodiscard]] kt_int32_t find_field(const void * p_definition, const kt_char_t * p_name,
                                    ku_validate_data_t * p_return_data)
{
    const auto *      p                = static_cast<const kt_char_t *>(p_definition);
    const kt_uint32_t number_of_fields = rg_i_load_u32(p);
    p += sizeof number_of_fields;
    for (kt_uint32_t field = 0; field < number_of_fields; ++field) {
        const kt_char_t * p_field_name = p + sizeof(kt_uint32_t);
        if (std::strcmp(p_field_name, p_name) == 0) {
            *p_return_data = {rg_i_load_u32(p), field};
            return 0;
        }
        p = p_field_name + std::strlen(p_field_name) + 1;
    }
    return no_such;
}

} // namespace

kt_int32_t rg_i_validate_column_callback(void * token, kt_char_t * p_name, kt_uint32_t, kt_uint32_t parent_id,
                                         ku_validate_data_t * p_return_data)
{
    const auto * p_table = static_cast<const rg_i_table_t *>(token);
    if (parent_id == no_parent) {
        const kt_uint32_t column = rg_i_find_column(p_table, p_name);
        if (column == p_table->total_columns)
            return no_such;
        *p_return_data = {p_table->p_columns[column].type, column};
        return 0;
    }
    if (parent_id >= p_table->total_columns || p_table->p_columns[parent_id].sd_defn == nullptr)
        return no_such;
    return find_field(p_table->p_columns[parent_id].sd_defn, p_name, p_return_data);
}

kt_int32_t rg_i_compile_expression(kt_char_ptr_t p_selection_criteria, rg_i_table_t * p_table,
                                   void ** p_compiled_expression, ku_iconv_t * p_string_conversion_handle)
{
    if (p_string_conversion_handle == nullptr)
        return rg_i_fail_internal(RG_HERE);

    owned_buffer     criteria_utf8;
    kt_uint32_t      input_size  = 0;
    kt_uint32_t      output_size = 0;
    const kt_int32_t converted   = ku_iconv_str_1(p_string_conversion_handle, 0, p_selection_criteria, &input_size,
                                                  criteria_utf8.out(), &output_size);
    if (converted != 0)
        return rg_i_fail_library_call(RG_HERE, "ku_iconv_str", converted);
    const kt_int32_t compiled =
        ku_comp_expr_1(criteria_utf8.get(), 0, rg_i_validate_column_callback, p_table, p_compiled_expression);
    if (compiled != 0)
        return rg_i_fail_library_call(RG_HERE, "ku_comp_expr", compiled);
    return 0;
}

kt_int32_t rg_i_criteria::compile(kt_char_ptr_t p_selection_criteria, rg_i_table_t * p_table)
{
    // A record is 20 bytes of head, which begin with the length of all of it, and then its data: four bytes, the slots,
    // and what the slots lead to.
    const kt_uint32_t fixed_length = rg_i_row_fixed_length(p_table->total_columns);
    constexpr auto    head_length  = static_cast<kt_int32_t>(RG_I_RECORD_HEAD_LENGTH);

    form_ = {p_table->total_columns, sizeof(kt_uint32_t), static_cast<kt_int32_t>(fixed_length), -head_length,
             RG_I_RECORD_HEAD_LENGTH + fixed_length};
    if (p_selection_criteria == nullptr)
        return 0;
    ku_iconv_t * p_handle = p_table->p_tree != nullptr ? p_table->p_tree->p_to_table_string_conversion_handle : nullptr;
    return rg_i_compile_expression(p_selection_criteria, p_table, &p_compiled_, p_handle);
}

kt_int32_t rg_i_criteria::fail(kt_int32_t result)
{
    return rg_i_fail_library_call(RG_HERE, "ku_exec_expr", result);
}
