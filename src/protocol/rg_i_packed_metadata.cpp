// SPDX-License-Identifier: MIT
// rg_i_packed_metadata: what a table is, presented as client values for packing.
//
// Layer: protocol. Called by packing; calls the value library for the defaults.
// Always holds: names point into the table; defaults are values of their own, since the stored form of an array of
// strings, binaries or handles is no client value, and since a damaged one must not be believed. What has been made so
// far can be released at any point.
// Locking: the caller holds the table's read lock.
// Failure: nothing stays allocated.
#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_trace.h"
#include "protocol/rg_i_packed_format.h"
#include "protocol/rg_x_protocol.h"

namespace
{

constexpr char module_version[] = "rg_i_packed_metadata 1.0";

// Room for the list, all zero; NULL if there is none.
[[nodiscard]] kt_sd_ptr_t new_structured_data(kt_uint32_t element_count)
{
    const size_t length =
        offsetof(kt_structured_data_t, elements) + element_count * sizeof(kt_structured_data_element_t);
    auto * p_sd = static_cast<kt_sd_ptr_t>(std::calloc(1, length));
    if (p_sd != nullptr)
        p_sd->element_count = element_count;
    return p_sd;
}

[[nodiscard]] kt_array_ptr_t new_array(kt_uint32_t element_count)
{
    const size_t length  = offsetof(kt_array_t, elements) + size_t{element_count} * sizeof(kt_value_t);
    auto *       p_array = static_cast<kt_array_ptr_t>(std::calloc(1, std::max(length, sizeof(kt_array_t))));
    if (p_array != nullptr)
        p_array->element_count = element_count;
    return p_array;
}

// The elements stand behind the record's end as it is declared.
[[nodiscard]] kt_structured_data_element_t * elements_of(kt_sd_ptr_t p_sd)
{
    return p_sd->elements;
}

[[nodiscard]] kt_value_t * elements_of(kt_array_ptr_t p_array)
{
    return p_array->elements;
}

void set_text(kt_structured_data_element_t * p_element, kt_char_ptr_t p_text)
{
    p_element->data_type      = KT_CHAR_PTR;
    p_element->value.ptr_char = p_text;
}

void set_uint32(kt_structured_data_element_t * p_element, kt_uint32_t number)
{
    p_element->data_type        = KT_UINT32;
    p_element->value.val_uint32 = number;
}

[[nodiscard]] bool is_structured(kt_data_type_t type)
{
    return type == KT_SD_PTR || type == KT_SD_PTR_ARRAY;
}

// The element that holds the default. A default of structured data doesn't travel.
[[nodiscard]] kt_int32_t present_default(const rg_i_table_t * p_table, const rg_column_t & column,
                                         kt_structured_data_element_t * p_element)
{
    if (is_structured(column.type)) {
        set_uint32(p_element, 0);
        return 0;
    }
    p_element->data_type = column.type;
    if (!rg_i_type_is_indirect(column.type)) {
        p_element->value = column.default_value;
        return 0;
    }
    const kt_int32_t result =
        kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, column.type, &p_element->value, &column.default_value,
                                                 rg_i_default_data(p_table), rg_i_default_data_length(p_table));
    if (result == KT_PMSG_E_NO_MEMORY)
        return rg_i_fail_no_memory(RG_HERE);
    if (result != 0)
        return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_packed_client_value", result);
    return 0;
}

// A place in the packed definition of a structured data column, and the end of the metadata record.
struct definition_walk_t {
    kt_char_ptr_t     p_at;
    const kt_char_t * p_end;

    [[nodiscard]] size_t left() const { return p_at <= p_end ? static_cast<size_t>(p_end - p_at) : 0; }
};

// Takes a field's type and name. False: they don't lie in the record.
[[nodiscard]] bool take_field(definition_walk_t & walk, kt_uint32_t * p_type, kt_char_ptr_t * p_name)
{
    if (walk.left() < sizeof *p_type)
        return false;
    *p_type = rg_i_load_u32(walk.p_at);
    *p_name = walk.p_at + sizeof *p_type;

    const size_t longest = walk.left() - sizeof *p_type;
    const size_t length  = strnlen(*p_name, longest);
    if (length == longest)
        return false;
    walk.p_at = *p_name + length + 1;
    return true;
}

constexpr kt_uint32_t shortest_field = sizeof(kt_uint32_t) + 1; // its type, and the terminator of its name

// Kept because callers depend on it: the walk starts at byte 8 of the definition, four bytes behind the first field. So
// the first field goes out with the first four bytes of its name as its type and the rest as its name; behind a first
// name of four bytes or more the walk is in step again, behind a shorter one it never is.
constexpr kt_uint32_t walk_start = 8;

// The definition as an array of types and one of names, in an element list that has room for them.
[[nodiscard]] kt_int32_t present_definition(const rg_i_table_t * p_table, const rg_column_t & column,
                                            kt_structured_data_element_t * p_elements)
{
    // The pointer in the record leads to the packed form, which is at any alignment.
    auto * const      p_definition     = reinterpret_cast<kt_char_ptr_t>(column.sd_defn);
    const kt_uint32_t number_of_fields = rg_i_load_u32(p_definition);
    kt_char_ptr_t     p_record         = rg_i_names_record_data(p_table);
    definition_walk_t walk{p_definition + walk_start, p_record + rg_i_record_data_length(p_record)};
    set_uint32(&p_elements[RG_I_PACKED_COLUMN_FIELDS], number_of_fields);
    p_elements[RG_I_PACKED_COLUMN_FIELD_TYPES].data_type = KT_UINT32_ARRAY;
    p_elements[RG_I_PACKED_COLUMN_FIELD_NAMES].data_type = KT_CHAR_PTR_ARRAY;
    if (number_of_fields == 0)
        return 0; // a missing array is an empty one
    if (number_of_fields > walk.left() / shortest_field)
        return rg_i_fail_internal(RG_HERE);

    kt_array_ptr_t p_types = p_elements[RG_I_PACKED_COLUMN_FIELD_TYPES].value.ptr_array = new_array(number_of_fields);
    kt_array_ptr_t p_names = p_elements[RG_I_PACKED_COLUMN_FIELD_NAMES].value.ptr_array = new_array(number_of_fields);
    if (p_types == nullptr || p_names == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    for (kt_uint32_t field = 0; field < number_of_fields; ++field)
        if (!take_field(walk, &elements_of(p_types)[field].val_uint32, &elements_of(p_names)[field].ptr_char))
            return rg_i_fail_internal(RG_HERE);
    return 0;
}

[[nodiscard]] kt_int32_t present_column(const rg_i_table_t * p_table, const rg_column_t & column, kt_sd_ptr_t p_sd)
{
    kt_structured_data_element_t * p_elements = elements_of(p_sd);
    set_text(&p_elements[RG_I_PACKED_COLUMN_NAME], column.name);
    set_uint32(&p_elements[RG_I_PACKED_COLUMN_TYPE], column.type);
    set_uint32(&p_elements[RG_I_PACKED_COLUMN_QUALIFIER], column.qualifier);
    p_elements[RG_I_PACKED_COLUMN_PROPERTIES].data_type       = KT_INT32;
    p_elements[RG_I_PACKED_COLUMN_PROPERTIES].value.val_int32 = column.properties;
    set_uint32(&p_elements[RG_I_PACKED_COLUMN_FIELDS], 0);
    if (const kt_int32_t rc = present_default(p_table, column, &p_elements[RG_I_PACKED_COLUMN_DEFAULT]); rc != 0)
        return rc;
    return column.sd_defn != nullptr ? present_definition(p_table, column, p_elements) : 0;
}

// Whether the element's value was allocated for it.
[[nodiscard]] bool owns_value(const kt_structured_data_element_t & element)
{
    return rg_i_type_is_indirect(element.data_type);
}

} // namespace

kt_int32_t rg_i_get_table_fixed_metadata_SD(rg_i_table_t * p_table, kt_uint32_t uncommitted_updates_visible,
                                            kt_sd_ptr_t * p_fixed_metadata_SD)
{
    kt_sd_ptr_t p_sd = new_structured_data(RG_I_PACKED_TABLE_ELEMENTS);
    if (p_sd == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    kt_char_ptr_t p_path = p_table->p_persistent_table_registry_path;
    if (p_path == nullptr)
        p_path = p_table->p_name != nullptr ? p_table->p_name : ku_ptr_empty_char_1;
    kt_structured_data_element_t * p_elements = elements_of(p_sd);
    set_text(&p_elements[RG_I_PACKED_TABLE_NAME], p_path);
    // Kept because callers depend on it: the count of the whole table, however few of its rows are packed.
    set_uint32(&p_elements[RG_I_PACKED_TABLE_ROWS],
               uncommitted_updates_visible != 0 ? p_table->total_applied_rows : p_table->total_committed_rows);
    set_uint32(&p_elements[RG_I_PACKED_TABLE_COLUMNS], p_table->total_columns);
    p_elements[RG_I_PACKED_TABLE_CHANGE_COUNTER].data_type        = KT_UINT64;
    p_elements[RG_I_PACKED_TABLE_CHANGE_COUNTER].value.val_uint64 = p_table->change_counter;
    p_elements[RG_I_PACKED_TABLE_PROPERTIES].data_type            = KT_INT32;
    *p_fixed_metadata_SD                                          = p_sd;
    return 0;
}

kt_int32_t rg_i_get_table_column_metadata_array(rg_i_table_t *   p_table, kt_uint32_t /* uncommitted_updates_visible */,
                                                kt_array_ptr_t * p_column_metadata_array)
{
    kt_array_ptr_t p_array = new_array(p_table->total_columns);
    if (p_array == nullptr)
        return rg_i_fail_no_memory(RG_HERE);

    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        const rg_column_t & definition = p_table->p_columns[column];
        kt_sd_ptr_t p_sd = new_structured_data(definition.sd_defn != nullptr ? RG_I_PACKED_COLUMN_ELEMENTS_WITH_DEF
                                                                             : RG_I_PACKED_COLUMN_ELEMENTS);
        elements_of(p_array)[column].ptr_sd = p_sd;
        const kt_int32_t rc =
            p_sd == nullptr ? rg_i_fail_no_memory(RG_HERE) : present_column(p_table, definition, p_sd);
        if (rc != 0) {
            rg_i_free_packed_table_column_metadata_array(p_array);
            return rc;
        }
    }
    *p_column_metadata_array = p_array;
    return 0;
}

void rg_i_free_packed_table_column_metadata_array(kt_array_ptr_t pColDefsArray)
{
    if (pColDefsArray == nullptr)
        return;
    for (kt_uint32_t column = 0; column < pColDefsArray->element_count; ++column) {
        kt_sd_ptr_t p_sd = elements_of(pColDefsArray)[column].ptr_sd;
        if (p_sd == nullptr)
            continue;
        kt_structured_data_element_t * p_elements = elements_of(p_sd);
        if (owns_value(p_elements[RG_I_PACKED_COLUMN_DEFAULT]))
            std::free(p_elements[RG_I_PACKED_COLUMN_DEFAULT].value.ptr_char);
        if (p_elements[RG_I_PACKED_COLUMN_FIELDS].value.val_uint32 != 0) {
            std::free(p_elements[RG_I_PACKED_COLUMN_FIELD_TYPES].value.ptr_array);
            std::free(p_elements[RG_I_PACKED_COLUMN_FIELD_NAMES].value.ptr_array);
        }
        std::free(p_sd);
    }
    std::free(pColDefsArray);
}
