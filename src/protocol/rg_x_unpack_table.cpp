// SPDX-License-Identifier: MIT
// rg_x_unpack_table: makes one table of a packed buffer a read-only table of a tree.
//
// Layer: protocol, exported. Takes the table's items out of the buffer as client values, and creates the table through
// rg_x_create_table, which puts the rows under it without copying them again.
// Always holds: nothing of the buffer is used once the call returns, and nothing of it is believed: items are read
// within the length in the header, and elements by the types that they tell.
// Locking: the tree's write lock, in rg_x_create_table; the buffer belongs to the caller. No ForkMutex.
// Failure: no table. The row array has one owner at any time: the table once it is in the tree, until then this call.
#include <algorithm>
#include <cstdlib>

#include "frame/rg_i_call_frame.h"
#include "protocol/rg_i_client_value.h"
#include "protocol/rg_i_packed_format.h"
#include "protocol/rg_x_protocol.h"

namespace
{

constexpr char module_version[] = "rg_x_unpack_table 1.0";

constexpr kt_char_t reading_operation[] = "kt_pmsg_build_conv_packed_client_value";

[[nodiscard]] kt_int32_t fail_reading(const rg_i_site_t & site, kt_int32_t result)
{
    return rg_i_fail_library_call(site, reading_operation, result);
}

// ---- Columns -------------------------------------------------------------------------------------------------------

[[nodiscard]] bool is_structured(kt_data_type_t type)
{
    return type == KT_SD_PTR || type == KT_SD_PTR_ARRAY;
}

// Whether the elements that every column has are there.
[[nodiscard]] bool has_column_elements(const kt_structured_data_t * p_sd)
{
    return rg_i_client_has_element(p_sd, RG_I_PACKED_COLUMN_NAME, KT_CHAR_PTR) &&
           rg_i_client_has_element(p_sd, RG_I_PACKED_COLUMN_TYPE, KT_UINT32) &&
           rg_i_client_has_element(p_sd, RG_I_PACKED_COLUMN_QUALIFIER, KT_UINT32) &&
           rg_i_client_has_element(p_sd, RG_I_PACKED_COLUMN_PROPERTIES, KT_INT32) &&
           rg_i_client_has_element(p_sd, RG_I_PACKED_COLUMN_FIELDS, KT_UINT32);
}

// Whether the default's value may be taken for one of the column's type. What a column of an indirect type takes for a
// pointer must be one. A default of structured data comes as the number 0, which makes a NULL pointer: the empty value.
[[nodiscard]] bool default_suits(kt_data_type_t column_type, const kt_structured_data_element_t & element)
{
    if (!rg_i_type_is_indirect(column_type))
        return !rg_i_type_is_indirect(element.data_type);
    if (element.data_type == column_type)
        return true;
    return is_structured(column_type) && element.data_type == KT_UINT32 && element.value.val_uint64 == 0;
}

// An array of at least so many elements in the element of that number, or NULL.
[[nodiscard]] const kt_array_t * array_of(const kt_structured_data_t * p_sd, kt_uint32_t index, kt_data_type_t type,
                                          kt_uint32_t element_count)
{
    if (!rg_i_client_has_element(p_sd, index, type))
        return nullptr;
    const kt_array_t * p_array = rg_i_client_elements(p_sd)[index].value.ptr_array;
    return p_array->element_count >= element_count ? p_array : nullptr;
}

// Makes the definition of a structured data column. Its names go on pointing into the client value.
[[nodiscard]] kt_int32_t unpack_definition(const kt_structured_data_t * p_sd, rg_sd_def_t ** p_p_definition)
{
    const kt_uint32_t  fields  = rg_i_client_uint32(p_sd, RG_I_PACKED_COLUMN_FIELDS);
    const kt_array_t * p_types = array_of(p_sd, RG_I_PACKED_COLUMN_FIELD_TYPES, KT_UINT32_ARRAY, fields);
    const kt_array_t * p_names = array_of(p_sd, RG_I_PACKED_COLUMN_FIELD_NAMES, KT_CHAR_PTR_ARRAY, fields);
    if (p_types == nullptr || p_names == nullptr)
        return fail_reading(RG_HERE, KT_PMSG_E_DAMAGED);

    const size_t length       = offsetof(rg_sd_def_t, fields) + size_t{fields} * sizeof(rg_field_def_t);
    auto *       p_definition = static_cast<rg_sd_def_t *>(std::malloc(std::max(length, sizeof(rg_sd_def_t))));
    if (p_definition == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    p_definition->number_of_fields = fields;
    rg_field_def_t * p_fields      = p_definition->fields;
    for (kt_uint32_t field = 0; field < fields; ++field)
        p_fields[field] = {rg_i_client_elements(p_types)[field].val_uint32,
                           rg_i_client_elements(p_names)[field].ptr_char};
    *p_p_definition = p_definition;
    return 0;
}

[[nodiscard]] kt_int32_t unpack_column(const kt_structured_data_t * p_sd, rg_column_t * p_column)
{
    if (!has_column_elements(p_sd))
        return fail_reading(RG_HERE, KT_PMSG_E_DAMAGED);
    const kt_structured_data_element_t * p_elements = rg_i_client_elements(p_sd);

    p_column->name          = p_elements[RG_I_PACKED_COLUMN_NAME].value.ptr_char;
    p_column->type          = p_elements[RG_I_PACKED_COLUMN_TYPE].value.val_uint32;
    p_column->qualifier     = p_elements[RG_I_PACKED_COLUMN_QUALIFIER].value.val_uint32;
    p_column->properties    = p_elements[RG_I_PACKED_COLUMN_PROPERTIES].value.val_int32;
    p_column->default_value = p_elements[RG_I_PACKED_COLUMN_DEFAULT].value;
    if (!default_suits(p_column->type, p_elements[RG_I_PACKED_COLUMN_DEFAULT]))
        return fail_reading(RG_HERE, KT_PMSG_E_DAMAGED);
    return p_sd->element_count > RG_I_PACKED_COLUMN_ELEMENTS ? unpack_definition(p_sd, &p_column->sd_defn) : 0;
}

// Releases the columns and their definitions when the scope is left.
struct column_definitions_t {
    rg_column_t * p_columns     = nullptr;
    kt_uint32_t   total_columns = 0;

    column_definitions_t() = default;
    ~column_definitions_t() { rg_i_free_unpacked_column_definitions(p_columns, total_columns); }
    column_definitions_t(const column_definitions_t &)             = delete;
    column_definitions_t & operator=(const column_definitions_t &) = delete;
};

// ---- Tables --------------------------------------------------------------------------------------------------------

// The hash table that the caller asks for.
struct hashing_t {
    kt_uint32_t                       total_hash_buckets; // 0: none
    rg_hash_function_t *              p_hash_function;
    rg_hash_keys_compare_function_t * p_compare_function;
};

// A missing hash function stands for the built-in rule, which reads resource handles and nothing else.
[[nodiscard]] bool can_hash(const hashing_t & hashing, const column_definitions_t & columns)
{
    if (hashing.p_hash_function != nullptr)
        return hashing.p_compare_function != nullptr;
    for (kt_uint32_t column = 0; column < columns.total_columns; ++column) {
        const rg_column_t & definition = columns.p_columns[column];
        const kt_uint32_t   kind       = definition.qualifier & 15;
        if ((kind == RG_PRIMARY_KEY || kind == RG_PRIMARY_KEY_NOCHECK) && definition.type != KT_RSRC_HANDLE_PTR)
            return false;
    }
    return true;
}

[[nodiscard]] kt_int32_t open_hash_table(const hashing_t & hashing, const column_definitions_t & columns,
                                         rg_hash_table_t ** p_p_hash_table)
{
    if (hashing.total_hash_buckets == 0)
        return 0; // a table keyed by resource handle gets one all the same
    if (!can_hash(hashing, columns))
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    return rg_i_hash_table_open(hashing.total_hash_buckets, hashing.p_hash_function, hashing.p_compare_function,
                                p_p_hash_table);
}

// The three items that make a table.
struct unpacked_items_t {
    owned_client_value fixed_metadata;
    owned_client_value column_metadata;
    owned_client_value rows;
};

[[nodiscard]] kt_int32_t read_items(const rg_i_packed_buffer_t & buffer, kt_uint32_t table_index,
                                    unpacked_items_t * p_items)
{
    const kt_char_t * p_table = buffer.p_buffer + rg_i_packed_table_offset(table_index);
    const auto        read    = [&](owned_client_value & value, kt_data_type_t type, size_t slot) {
        return value.read(type, p_table + slot, buffer.p_indirect_data, buffer.indirect_length);
    };
    if (const kt_int32_t result =
            read(p_items->fixed_metadata, KT_SD_PTR, offsetof(rg_i_packed_table_t, fixed_metadata));
        result != 0)
        return fail_reading(RG_HERE, result);
    if (!rg_i_client_has_element(p_items->fixed_metadata.get().ptr_sd, RG_I_PACKED_TABLE_NAME, KT_CHAR_PTR))
        return fail_reading(RG_HERE, KT_PMSG_E_DAMAGED);
    if (const kt_int32_t result =
            read(p_items->column_metadata, KT_SD_PTR_ARRAY, offsetof(rg_i_packed_table_t, column_metadata));
        result != 0)
        return fail_reading(RG_HERE, result);
    if (const kt_int32_t result = read(p_items->rows, KT_BINARY_PTR_ARRAY, offsetof(rg_i_packed_table_t, rows));
        result != 0)
        return fail_reading(RG_HERE, result);
    return 0;
}

[[nodiscard]] kt_int32_t unpack_table(void * p_buffer, const hashing_t & hashing, rg_opaque_handle_t tree_handle,
                                      kt_uint32_t table_index, rg_opaque_handle_t * p_table)
{
    if (p_table == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);
    rg_i_packed_buffer_t buffer{};
    if (const kt_int32_t rc = rg_i_open_packed_buffer(p_buffer, &buffer); rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_check_packed_table_index(buffer, table_index); rc != 0)
        return rc;

    unpacked_items_t items;
    if (const kt_int32_t rc = read_items(buffer, table_index, &items); rc != 0)
        return rc;
    column_definitions_t columns;
    if (const kt_int32_t rc = rg_i_unpack_column_definitions(items.column_metadata.get().ptr_array,
                                                             &columns.total_columns, &columns.p_columns);
        rc != 0)
        return rc;
    rg_hash_table_t * p_hash_table = nullptr;
    if (const kt_int32_t rc = open_hash_table(hashing, columns, &p_hash_table); rc != 0)
        return rc;

    kt_char_ptr_t p_path =
        rg_i_client_elements(items.fixed_metadata.get().ptr_sd)[RG_I_PACKED_TABLE_NAME].value.ptr_char;
    rg_opaque_handle_t table = nullptr;
    if (const kt_int32_t rc = rg_x_create_table(tree_handle, p_path, columns.p_columns, columns.total_columns,
                                                RG_MODE_READ, p_hash_table, items.rows.get().ptr_array, &table);
        rc != 0)
        return rc;
    items.rows.release(); // to the table
    *p_table = table;
    return 0;
}

} // namespace

kt_int32_t rg_i_unpack_column_definitions(kt_array_ptr_t p_column_metadata_array, kt_uint32_t * p_total_columns,
                                          rg_column_t ** p_p_columns)
{
    const kt_uint32_t total_columns = p_column_metadata_array->element_count;
    auto * p_columns = static_cast<rg_column_t *>(std::calloc(std::max<size_t>(total_columns, 1), sizeof(rg_column_t)));
    if (p_columns == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    for (kt_uint32_t column = 0; column < total_columns; ++column)
        if (const kt_int32_t rc = unpack_column(rg_i_client_sd(p_column_metadata_array, column), &p_columns[column]);
            rc != 0) {
            rg_i_free_unpacked_column_definitions(p_columns, column);
            return rc;
        }
    *p_total_columns = total_columns;
    *p_p_columns     = p_columns;
    return 0;
}

void rg_i_free_unpacked_column_definitions(rg_column_t * p_columns, kt_uint32_t total_columns)
{
    for (kt_uint32_t column = 0; column < total_columns; ++column)
        std::free(p_columns[column].sd_defn);
    std::free(p_columns);
}

extern "C" kt_int32_t rg_unpack_table_1(void * p_buffer, kt_uint32_t total_hash_buckets,
                                        rg_hash_function_t *              hash_function,
                                        rg_hash_keys_compare_function_t * compare_function,
                                        rg_opaque_handle_t tree_handle, kt_uint32_t table_index,
                                        rg_opaque_handle_t * p_table)
{
    rg_i_trace_entry(entry_id::unpack_table);
    const hashing_t hashing{total_hash_buckets, hash_function, compare_function};
    return rg_i_finish_call(entry_id::unpack_table, unpack_table(p_buffer, hashing, tree_handle, table_index, p_table));
}
