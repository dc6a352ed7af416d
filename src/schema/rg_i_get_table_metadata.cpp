// SPDX-License-Identifier: MIT
// rg_i_get_table_metadata: describes a table: its name, its counts, and deep copies of its column definitions.
//
// Layer: schema. Column changes take their column list from here too.
// Always holds: each allocation belongs to the result, and nothing in it points into the table.
// Locking: the caller holds the table's read lock or its write lock.
// Failure: what was made so far is released, and the result isn't delivered.
#include "schema/rg_i_get_table_metadata.h"

#include <algorithm>
#include <cstdlib>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "table/rg_i_packed_definition.h"

namespace
{

constexpr char module_version[] = "rg_i_get_table_metadata 1.0";

[[nodiscard]] bool is_left_out(const rg_column_t & column, kt_int32_t all_metadata)
{
    return all_metadata != RG_I_ALL_COLUMNS && (column.qualifier & RG_INVISIBLE) != 0;
}

void free_definition(rg_sd_def_t * p_definition)
{
    if (p_definition == nullptr)
        return;
    rg_field_def_t * p_fields = p_definition->fields;
    for (kt_uint32_t field = 0; field < p_definition->number_of_fields; ++field)
        std::free(p_fields[field].name);
    std::free(p_definition);
}

// The client form of a packed definition, or NULL without memory.
[[nodiscard]] rg_sd_def_t * copy_definition(const rg_sd_def_t * p_packed)
{
    const kt_uint32_t fields       = rg_i_packed_definition_fields(p_packed);
    const size_t      length       = offsetof(rg_sd_def_t, fields) + size_t{fields} * sizeof(rg_field_def_t);
    auto *            p_definition = static_cast<rg_sd_def_t *>(std::calloc(1, std::max(length, sizeof(rg_sd_def_t))));
    if (p_definition == nullptr)
        return nullptr;

    rg_field_def_t * p_fields = p_definition->fields;
    rg_i_for_each_packed_field(p_packed, [&](kt_uint32_t position, const rg_i_packed_field_t & field) {
        p_fields[position] = {field.type, strdup(field.p_name)};
        if (p_fields[position].name == nullptr)
            return false;
        p_definition->number_of_fields = position + 1;
        return true;
    });
    if (p_definition->number_of_fields == fields)
        return p_definition;
    free_definition(p_definition);
    return nullptr;
}

[[nodiscard]] kt_int32_t copy_default_value(const rg_i_table_t & table, const rg_column_t & column,
                                            kt_value_t * p_default_value)
{
    if (!rg_i_type_is_indirect(column.type)) {
        *p_default_value = column.default_value;
        return 0;
    }
    ku_iconv_t *     p_handle = table.p_tree != nullptr ? table.p_tree->p_from_table_string_conversion_handle : nullptr;
    const kt_int32_t result =
        kt_pmsg_build_conv_packed_client_value_1(p_handle, 0, column.type, p_default_value, &column.default_value,
                                                 rg_i_default_data(&table), rg_i_default_data_length(&table));
    return result == 0 ? 0 : rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", result);
}

// Fills in a cleared definition. What it owns after a failure is still its own, for rg_i_free_column_metadata.
[[nodiscard]] kt_int32_t copy_column(const rg_i_table_t & table, const rg_column_t & from, rg_column_t * p_to)
{
    p_to->type       = from.type;
    p_to->qualifier  = from.qualifier;
    p_to->properties = from.properties;
    p_to->name       = strdup(from.name);
    if (p_to->name == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    if (from.sd_defn != nullptr) {
        p_to->sd_defn = copy_definition(from.sd_defn);
        if (p_to->sd_defn == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
    }
    return copy_default_value(table, from, &p_to->default_value);
}

[[nodiscard]] kt_int32_t copy_columns(const rg_i_table_t & table, kt_int32_t all_metadata,
                                      rg_table_metadata_t & metadata)
{
    metadata.column_definitions = static_cast<rg_column_t *>(std::calloc(table.total_columns, sizeof(rg_column_t)));
    if (metadata.column_definitions == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    metadata.number_of_columns = 0;
    for (kt_uint32_t column = 0; column < table.total_columns; ++column) {
        const rg_column_t & from = table.p_columns[column];
        if (is_left_out(from, all_metadata))
            continue;
        rg_column_t * p_to = &metadata.column_definitions[metadata.number_of_columns];
        if (const kt_int32_t rc = copy_column(table, from, p_to); rc != 0) {
            rg_i_free_column_metadata(p_to, 1);
            return rc;
        }
        ++metadata.number_of_columns;
    }
    return 0;
}

[[nodiscard]] kt_int32_t describe(const rg_i_table_t & table, kt_int32_t all_metadata, rg_table_metadata_t & metadata)
{
    metadata.number_of_rows =
        table.uncommitted_updates_visible != 0 ? table.total_applied_rows : table.total_committed_rows;
    metadata.number_of_columns    = table.total_columns;
    metadata.table_change_counter = table.change_counter;

    const kt_char_t * p_name = table.p_persistent_table_registry_path != nullptr
                                   ? table.p_persistent_table_registry_path
                               : table.p_name != nullptr ? table.p_name
                                                         : "";
    metadata.name            = strdup(p_name);
    if (metadata.name == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    return all_metadata == RG_I_NO_COLUMNS ? 0 : copy_columns(table, all_metadata, metadata);
}

} // namespace

kt_int32_t rg_i_get_table_metadata(rg_i_table_t * p_table, kt_int32_t all_metadata, rg_table_metadata_t ** p_p_metadata)
{
    auto *     p_metadata = static_cast<rg_table_metadata_t *>(std::calloc(1, sizeof(rg_table_metadata_t)));
    kt_int32_t rc         = p_metadata == nullptr ? rg_i_fail_no_memory(RG_HERE) : 0;
    if (rc == 0)
        rc = describe(*p_table, all_metadata, *p_metadata);
    if (rc != 0) {
        // Kept because callers depend on it: the exported call releases what was made, and clears the error record, or
        // sets it to a NULL pointer if the record itself couldn't be made. The code returned is the failure's own.
        (void)rg_free_table_metadata_1(p_metadata);
        return rc;
    }
    *p_p_metadata = p_metadata;
    return 0;
}

void rg_i_free_column_metadata(rg_column_t * p_column, kt_uint32_t total_columns)
{
    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        std::free(p_column[column].name);
        free_definition(p_column[column].sd_defn);
        if (rg_i_type_is_indirect(p_column[column].type))
            std::free(p_column[column].default_value.ptr_char);
    }
}
