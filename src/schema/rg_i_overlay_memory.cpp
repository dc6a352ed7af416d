// SPDX-License-Identifier: MIT
// rg_i_overlay_memory: edits a column's definition where it stands in memory.
//
// Layer: schema. Calls the value library for the stored form of a default.
// Always holds: nothing is written to the file. The next rewrite, or a copy of the table to a file, takes the
// definitions from memory and the overlay with them. A default of a variable-length type is overwritten in its own
// place and can't outgrow it: nothing of the record moves.
// Locking: the caller holds the table's write lock.
// Failure: the column is as it was.
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "schema/rg_i_column_changes.h"
#include "storage/rg_i_disk_format.h"
#include "table/rg_i_packed_definition.h"

namespace
{

constexpr char module_version[] = "rg_i_overlay_memory 1.0";

constexpr kt_uint32_t qualifier_kind_mask = 15;

[[nodiscard]] kt_int32_t find_column(const rg_i_table_t * p_table, const kt_char_t * p_column_name,
                                     rg_column_t ** p_p_column)
{
    if (p_column_name == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    const kt_uint32_t column = rg_i_find_column(p_table, p_column_name);
    if (column == p_table->total_columns)
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    *p_p_column = &p_table->p_columns[column];
    return 0;
}

[[nodiscard]] bool is_standard(rg_qualifier_t qualifier)
{
    return (qualifier & qualifier_kind_mask) == RG_STANDARD;
}

// ---- The place of a default ----

[[nodiscard]] const kt_char_t * end_of_definition(const rg_sd_def_t * p_definition)
{
    const kt_char_t * p_end = reinterpret_cast<const kt_char_t *>(p_definition) + sizeof(rg_disk_sd_def_t);
    rg_i_for_each_packed_field(p_definition, [&](kt_uint32_t, const rg_i_packed_field_t & field) {
        p_end = field.p_name + std::strlen(field.p_name) + 1;
        return true;
    });
    return p_end;
}

// Whether the default's bytes are nobody else's. In a damaged file a default may lead to the names behind the default
// data, and names or definitions may stand among the defaults: what is written there mustn't take their terminators.
[[nodiscard]] bool default_stands_alone(const rg_i_table_t * p_table, const kt_pmsg_value_anchor_t & anchor)
{
    const kt_uint32_t data_length = rg_i_default_data_length(p_table);
    if (anchor.offset > data_length || anchor.length > data_length - anchor.offset)
        return false;

    // Names and definitions may lie in the record of another table, which is laid out like this one.
    const kt_char_t * const p_names_area =
        rg_i_names_record_data(p_table) + sizeof(rg_i_metadata_head_t) + p_table->total_columns * sizeof(rg_column_t);
    const kt_char_t * const p_default = p_names_area + anchor.offset;
    const auto              meets     = [&](const kt_char_t * p_begin, const kt_char_t * p_end) {
        return p_begin < p_default + anchor.length && p_default < p_end;
    };
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        const rg_column_t & definition = p_table->p_columns[column];
        if (meets(definition.name, definition.name + std::strlen(definition.name) + 1))
            return false;
        if (definition.sd_defn != nullptr &&
            meets(reinterpret_cast<const kt_char_t *>(definition.sd_defn), end_of_definition(definition.sd_defn)))
            return false;
    }
    return true;
}

// Builds the value in room of the length that the present one takes, and then writes it over that.
[[nodiscard]] kt_int32_t overwrite_default(rg_i_table_t * p_table, rg_column_t * p_column, kt_value_t new_value)
{
    kt_pmsg_value_anchor_t anchor;
    std::memcpy(&anchor, &p_column->default_value, sizeof anchor);
    if (!default_stands_alone(p_table, anchor))
        return rg_i_fail(RG_HERE, RG_E_TABLE_UNREADABLE);
    const owned_buffer scratch(static_cast<kt_char_ptr_t>(std::malloc(anchor.length != 0 ? anchor.length : 1)));
    if (!scratch)
        return rg_i_fail_no_memory(RG_HERE);

    kt_value_t value;
    rg_i_dup_nonscalar_value(p_column->type, &new_value, &value);
    ku_iconv_t * p_handle = p_table->p_tree != nullptr ? p_table->p_tree->p_to_table_string_conversion_handle : nullptr;
    kt_pmsg_value_t  target{};
    kt_uint32_t      new_length = 0;
    const kt_int32_t result     = kt_pmsg_build_conv_protocol_value_1(p_handle, 0, p_column->type, &value, &target,
                                                                      scratch.get(), anchor.length, &new_length);
    // Kept because callers depend on it: a value that is too long is reported with the code, and so with the message,
    // of a deletion that finds no rows.
    if (result == KT_PMSG_E_NO_ROOM)
        return rg_i_fail(RG_HERE, RG_E_NO_ROWS_TO_DELETE);
    if (result != 0)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_protocol_value", result);

    // Nothing below fails.
    std::memcpy(rg_i_default_data(p_table) + anchor.offset, scratch.get(), new_length);
    anchor.length = new_length;
    std::memcpy(&p_column->default_value, &anchor, sizeof anchor);
    return 0;
}

} // namespace

kt_int32_t rg_i_overlay_memory_default_value(rg_i_table_t * p_table, kt_char_ptr_t p_column_name,
                                             kt_value_t new_default_value)
{
    rg_column_t * p_column = nullptr;
    if (const kt_int32_t rc = find_column(p_table, p_column_name, &p_column); rc != 0)
        return rc;
    if (rg_i_type_is_indirect(p_column->type))
        return overwrite_default(p_table, p_column, new_default_value);
    p_column->default_value = new_default_value;
    return 0;
}

kt_int32_t rg_i_overlay_memory_column_qualifier(rg_i_table_t * p_table, kt_char_ptr_t p_column_name,
                                                rg_qualifier_t new_qualifier)
{
    if (!is_standard(new_qualifier))
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    rg_column_t * p_column = nullptr;
    if (const kt_int32_t rc = find_column(p_table, p_column_name, &p_column); rc != 0)
        return rc;
    if (!is_standard(p_column->qualifier))
        return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
    p_column->qualifier = new_qualifier;
    return 0;
}
