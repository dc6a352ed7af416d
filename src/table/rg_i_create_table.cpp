// SPDX-License-Identifier: MIT
// rg_i_create_table: makes a working table in memory out of a caller's columns.
//
// Layer: table. All tables start here: a table with a file is made as a transient one first, and so is the new form of
// a table whose columns change. Always holds: the key column is column 0 of the table. The metadata record is one block
// that holds the columns, the indirect data of their defaults, their names and their structured data definitions, in
// this order; apart from the column array it is byte for byte what the file holds (docs/FILE-FORMAT.md). Locking: only
// the new object and the caller's array are touched. The caller holds the tree's write lock, or makes a table that no
// tree knows. Failure: columns are checked ahead of any allocation. A hash table that is passed in belongs to the
// callee from the start: the new table has it, or it has been closed.
#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "frame/rg_i_guards.h"
#include "frame/rg_i_trace.h"
#include "rg_i_table.h"
#include "storage/rg_i_disk_format.h"

namespace
{

constexpr char module_version[] = "rg_i_create_table 1.0";

constexpr kt_uint32_t longest_column_name        = 255;
constexpr kt_uint32_t rows_to_start_with         = 100;
constexpr kt_uint32_t default_data_to_start_with = 4096;
constexpr kt_uint32_t qualifier_kind_mask        = 15;

constexpr kt_uint32_t metadata_head_length = sizeof(rg_i_metadata_head_t);
constexpr kt_uint32_t sd_definition_head   = sizeof(rg_disk_sd_def_t);
constexpr kt_uint32_t sd_definition_spare  = 4; // reserved with each definition, and left zero
constexpr kt_uint32_t sd_field_head        = offsetof(disk_field_def, name_char_array);

[[nodiscard]] bool is_key_kind(kt_uint32_t kind)
{
    return kind == RG_PRIMARY_KEY || kind == RG_PRIMARY_KEY_NOCHECK;
}

[[nodiscard]] bool has_definition(const rg_column_t & column)
{
    return column.type == KT_SD_PTR || column.type == KT_SD_PTR_ARRAY;
}

[[nodiscard]] bool valid_definition(const rg_sd_def_t * p_definition)
{
    if (p_definition == nullptr)
        return false;
    const rg_field_def_t * p_fields = p_definition->fields;
    for (kt_uint32_t field = 0; field < p_definition->number_of_fields; ++field)
        if (p_fields[field].name == nullptr)
            return false;
    return true;
}

// A key is a number, a string or a resource handle.
[[nodiscard]] bool can_be_key(kt_data_type_t type)
{
    return type <= KT_RSRC_HANDLE_PTR && type != KT_BINARY_PTR;
}

[[nodiscard]] bool valid_column(const rg_column_t & column)
{
    const kt_uint32_t kind = column.qualifier & qualifier_kind_mask;
    return rg_i_valid_column_name(column.name) != 0 && column.type >= KT_INT32 && column.type <= KT_SD_PTR_ARRAY &&
           kind >= RG_STANDARD && kind <= RG_PRIMARY_KEY_NOCHECK &&
           (!has_definition(column) || valid_definition(column.sd_defn)) &&
           (!is_key_kind(kind) || can_be_key(column.type));
}

// Checks all definitions, and finds the key column.
[[nodiscard]] kt_int32_t check_columns(const rg_column_t * p_columns, kt_uint32_t total_columns,
                                       kt_uint32_t * p_key_column)
{
    if (total_columns == 0)
        return rg_i_fail(RG_HERE, RG_E_NO_COLUMNS);
    if (p_columns == nullptr)
        return rg_i_fail(RG_HERE, RG_E_NULL_POINTER);

    kt_uint32_t total_keys = 0;
    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        if (!valid_column(p_columns[column]))
            return rg_i_fail(RG_HERE, RG_E_INVALID_COLUMN);
        if (is_key_kind(p_columns[column].qualifier & qualifier_kind_mask)) {
            ++total_keys;
            *p_key_column = column;
        }
    }
    if (total_keys == 0)
        return rg_i_fail(RG_HERE, RG_E_KEY_EXPECTED);
    if (total_keys > 1)
        return rg_i_fail(RG_HERE, RG_E_DUPLICATE_KEY);

    for (kt_uint32_t column = 1; column < total_columns; ++column)
        for (kt_uint32_t earlier = 0; earlier < column; ++earlier)
            if (std::strcmp(p_columns[earlier].name, p_columns[column].name) == 0)
                return rg_i_fail(RG_HERE, RG_E_DUPLICATE_COLUMN);
    return 0;
}

[[nodiscard]] kt_uint64_t definition_length(const rg_sd_def_t * p_definition)
{
    kt_uint64_t            length   = sd_definition_head + sd_definition_spare;
    const rg_field_def_t * p_fields = p_definition->fields;
    for (kt_uint32_t field = 0; field < p_definition->number_of_fields; ++field)
        length += sd_field_head + std::strlen(p_fields[field].name) + 1;
    return length;
}

// Bytes of the metadata record's data. Each definition gets four bytes more than it takes: they stay zero at the
// record's end, and stand in the file.
[[nodiscard]] kt_uint64_t metadata_length(const rg_column_t * p_columns, kt_uint32_t total_columns,
                                          kt_uint32_t default_data_length)
{
    kt_uint64_t length =
        metadata_head_length + kt_uint64_t{default_data_length} + kt_uint64_t{total_columns} * sizeof(rg_column_t);
    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        length += std::strlen(p_columns[column].name) + 1;
        if (has_definition(p_columns[column]))
            length += definition_length(p_columns[column].sd_defn);
    }
    return length;
}

// Copies a string with its terminator, and returns the place behind it.
[[nodiscard]] kt_char_ptr_t put_string(kt_char_ptr_t p_to, const kt_char_t * p_string)
{
    const size_t size = std::strlen(p_string) + 1;
    std::memcpy(p_to, p_string, size);
    return p_to + size;
}

[[nodiscard]] kt_char_ptr_t put_definition(kt_char_ptr_t p_to, const rg_sd_def_t * p_definition)
{
    rg_i_store_u32(p_to, p_definition->number_of_fields);
    p_to += sd_definition_head;
    const rg_field_def_t * p_fields = p_definition->fields;
    for (kt_uint32_t field = 0; field < p_definition->number_of_fields; ++field) {
        rg_i_store_u32(p_to, p_fields[field].type);
        p_to = put_string(p_to + sd_field_head, p_fields[field].name);
    }
    return p_to;
}

// 1 on a host that stores the high byte first.
[[nodiscard]] kt_uint32_t host_is_big_endian()
{
    const kt_uint16_t mark       = 0xFEFF;
    kt_uint8_t        first_byte = 0;
    std::memcpy(&first_byte, &mark, sizeof first_byte);
    return first_byte == 0xFE ? 1 : 0;
}

// Fills the reserved metadata record. The columns are in the table's order, with anchors as defaults where the values
// are indirect.
void fill_metadata(rg_i_table_t * p_table, const rg_column_t * p_columns, kt_uint32_t total_columns,
                   const kt_char_t * p_default_data, kt_uint32_t default_data_length)
{
    kt_char_ptr_t p_head   = p_table->p_metadata_record_data;
    p_table->p_columns     = reinterpret_cast<rg_column_t *>(p_head + metadata_head_length);
    p_table->total_columns = total_columns;
    rg_i_store(p_head,
               rg_i_metadata_head_t{host_is_big_endian(), 0, total_columns, p_table->total_variable_length_columns});
    std::memcpy(p_table->p_columns, p_columns, total_columns * sizeof *p_columns);

    kt_char_ptr_t p_end = rg_i_default_data(p_table);
    if (default_data_length > 0)
        std::memcpy(p_end, p_default_data, default_data_length);
    p_end += default_data_length;

    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        rg_column_t & to = p_table->p_columns[column];
        to.name          = p_end;
        p_end            = put_string(p_end, p_columns[column].name);
        to.sd_defn       = nullptr;
        if (has_definition(to)) {
            // In the record the pointer leads to the packed form: readers walk it by hand.
            to.sd_defn = reinterpret_cast<rg_sd_def_t *>(p_end);
            p_end      = put_definition(p_end, p_columns[column].sd_defn);
        }
    }
}

// Packs the defaults, and builds the metadata record from the columns in the table's order.
[[nodiscard]] kt_int32_t build_metadata(rg_i_table_t * p_table, rg_column_t * p_columns, kt_uint32_t total_columns)
{
    owned_buffer default_data;
    kt_uint32_t  default_data_length = 0;
    ku_iconv_t * p_conversion =
        p_table->p_tree != nullptr ? p_table->p_tree->p_to_table_string_conversion_handle : nullptr;
    const kt_int32_t rc =
        rg_i_pack_variable_length_default_values(p_columns, total_columns, default_data.out(), &default_data_length,
                                                 &p_table->total_variable_length_columns, p_conversion);
    if (rc != 0 && rc != RG_E_INTERNAL) // which says that there is no indirect column
        return rc;

    const kt_uint64_t length = metadata_length(p_columns, total_columns, default_data_length);
    if (length > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE);
    if (const kt_int32_t reserve_rc =
            rg_i_reserve_record(&p_table->record_buffer_pool, static_cast<kt_uint32_t>(length), RG_RECORD_TYPE_METADATA,
                                &p_table->p_metadata_record_data);
        reserve_rc != 0)
        return reserve_rc;
    fill_metadata(p_table, p_columns, total_columns, default_data.get(), default_data_length);
    return 0;
}

// Everything of a new table but its metadata record.
[[nodiscard]] kt_int32_t give_name_and_index(rg_i_table_t * p_table, const kt_char_t * p_name)
{
    if (p_name != nullptr) {
        p_table->p_name = strdup(p_name);
        if (p_table->p_name == nullptr)
            return rg_i_fail_no_memory(RG_HERE);
    }
    return rg_i_establish_rows_index(p_table, rows_to_start_with);
}

// What a finished table has besides. A table keyed by resource handle is always hashed.
[[nodiscard]] kt_int32_t give_hash_table_and_blob(rg_i_table_t * p_table)
{
    if (p_table->p_rows_hash_table == nullptr && p_table->p_columns[0].type == KT_RSRC_HANDLE_PTR)
        if (const kt_int32_t rc = rg_i_hash_table_open(0, nullptr, nullptr, &p_table->p_rows_hash_table); rc != 0)
            return rc;
    return rg_i_allocate_application_metadata_buffer(1, &p_table->p_application_metadata);
}

// The columns are in the table's order here.
[[nodiscard]] kt_int32_t build_table(rg_i_table_t * p_table, const kt_char_t * p_name, rg_column_t * p_columns,
                                     kt_uint32_t total_columns)
{
    if (const kt_int32_t rc = give_name_and_index(p_table, p_name); rc != 0)
        return rc;
    if (const kt_int32_t rc = build_metadata(p_table, p_columns, total_columns); rc != 0)
        return rc;
    return give_hash_table_and_blob(p_table);
}

// A column as the file holds it: offsets from the start of the variable region in place of pointers.
[[nodiscard]] rg_disk_column_t disk_column(const rg_column_t & column, const kt_char_t * p_region)
{
    rg_disk_column_t to{};
    to.name_offset = static_cast<kt_uint32_t>(column.name - p_region);
    to.type        = column.type;
    to.qualifier   = column.qualifier;
    to.properties  = column.properties;
    if (column.sd_defn != nullptr)
        to.sd_defn_offset = static_cast<kt_uint32_t>(reinterpret_cast<const kt_char_t *>(column.sd_defn) - p_region);
    std::memcpy(to.default_value, &column.default_value, sizeof to.default_value);
    return to;
}

} // namespace

// ---- Columns ----

kt_uint32_t rg_i_valid_column_name(kt_char_ptr_t column_name)
{
    if (column_name == nullptr)
        return 0;
    const size_t length = strnlen(column_name, longest_column_name + 1);
    if (length == 0 || length > longest_column_name)
        return 0;
    if (std::isalpha(static_cast<unsigned char>(column_name[0])) == 0)
        return 0;
    for (size_t i = 1; i < length; ++i) {
        const auto c = static_cast<unsigned char>(column_name[i]);
        if (std::isspace(c) != 0 || (std::isalnum(c) == 0 && c != '_'))
            return 0;
    }
    return 1;
}

void rg_i_swap_columns(rg_column_t * p_column1, rg_column_t * p_column2)
{
    std::swap(*p_column1, *p_column2);
}

kt_int32_t rg_i_pack_variable_length_default_values(rg_column_t * p_columns, kt_uint32_t total_columns,
                                                    kt_char_ptr_t * p_default_value_indirect_data,
                                                    kt_uint32_t *   default_value_indirect_data_length,
                                                    kt_uint32_t *   total_variable_length_columns_return,
                                                    ku_iconv_t *    p_string_conversion_handle)
{
    kt_uint32_t  capacity = default_data_to_start_with;
    owned_buffer buffer(static_cast<char *>(std::malloc(capacity)));
    if (!buffer)
        return rg_i_fail_no_memory(RG_HERE);

    kt_uint32_t total_variable_length_columns = 0;
    kt_uint32_t offset                        = 0;
    for (kt_uint32_t column = 0; column < total_columns; ++column) {
        rg_column_t & definition = p_columns[column];
        if (!rg_i_type_is_indirect(definition.type))
            continue;

        kt_value_t value;
        rg_i_dup_nonscalar_value(definition.type, &definition.default_value, &value);
        kt_pmsg_value_t target;
        std::memset(&target, 0, sizeof target);
        for (;;) {
            const kt_int32_t rc = kt_pmsg_build_conv_protocol_value_1(p_string_conversion_handle, 0, definition.type,
                                                                      &value, &target, buffer.get(), capacity, &offset);
            if (rc == 0)
                break;
            if (rc != KT_PMSG_E_NO_ROOM)
                return rg_i_fail_library_call(RG_HERE, "kt_pmsg_build_conv_protocol_value", rc);

            void * p_larger = capacity > UINT32_MAX / 2 ? nullptr : std::realloc(buffer.get(), size_t{capacity} * 2);
            if (p_larger == nullptr)
                return rg_i_fail_no_memory(RG_HERE);
            static_cast<void>(buffer.release()); // realloc has taken the old one
            buffer.reset(static_cast<char *>(p_larger));
            capacity *= 2;
        }
        static_assert(sizeof target == sizeof definition.default_value);
        std::memcpy(&definition.default_value, &target, sizeof target);
        ++total_variable_length_columns;
    }

    *total_variable_length_columns_return = total_variable_length_columns;
    if (total_variable_length_columns == 0) {
        *p_default_value_indirect_data      = nullptr;
        *default_value_indirect_data_length = 0;
        return RG_E_INTERNAL; // no failure and no record: there is no indirect column
    }
    *p_default_value_indirect_data      = buffer.release();
    *default_value_indirect_data_length = offset;
    return 0;
}

// ---- Table objects ----

kt_int32_t rg_i_create_null_table(rg_i_table_t ** p_table)
{
    auto * p_new_table = static_cast<rg_i_table_t *>(std::calloc(1, sizeof(rg_i_table_t)));
    if (p_new_table == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    if (const kt_int32_t rc = rg_i_rb_initialize_record_buffer_pool(0, &p_new_table->record_buffer_pool); rc != 0) {
        std::free(p_new_table);
        return rc;
    }

    p_new_table->references            = 1;
    p_new_table->implicitly_controlled = 1;
    p_new_table->change_counter        = 1;
    p_new_table->file_fd               = -1;
    p_new_table->rewrite_file_fd       = -1;
    rg_i_rw_open(&p_new_table->lock);
    if (std::getenv("RG_UNCOMMITTED_UPDATES_VISIBLE") != nullptr)
        p_new_table->uncommitted_updates_visible = 1;
    *p_table = p_new_table;
    return 0;
}

kt_int32_t rg_i_create_transient_table_common(rg_i_tree_t * p_tree, kt_char_ptr_t p_name, rg_column_t * p_columns,
                                              kt_uint32_t total_columns, kt_int32_t mode,
                                              rg_hash_table_t * p_rows_hash_table, rg_i_table_t ** p_table)
{
    kt_uint32_t    key_column  = 0;
    rg_i_table_t * p_new_table = nullptr;

    kt_int32_t rc = check_columns(p_columns, total_columns, &key_column);
    if (rc == 0)
        rc = rg_i_create_null_table(&p_new_table);
    if (rc != 0) {
        rg_i_hash_table_close(p_rows_hash_table);
        return rc;
    }

    p_new_table->p_rows_hash_table     = p_rows_hash_table;
    p_new_table->implicitly_controlled = (mode & RG_MODE_EXPLICIT_CONTROL) == 0 ? 1 : 0;
    p_new_table->p_tree                = p_tree;
    // The key changes places with the first column, in the caller's array while we read it, and nothing else moves.
    rg_i_swap_columns(&p_columns[0], &p_columns[key_column]);
    rc = build_table(p_new_table, p_name, p_columns, total_columns);
    rg_i_swap_columns(&p_columns[0], &p_columns[key_column]);
    if (rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }
    *p_table = p_new_table;
    return 0;
}

kt_int32_t rg_i_reserve_room_for_rows(rg_i_table_t * p_table)
{
    const kt_uint64_t length =
        ((kt_uint64_t{p_table->total_columns} + 3) * 8 + kt_uint64_t{p_table->total_variable_length_columns} * 100) *
        rows_to_start_with;
    if (length > UINT32_MAX)
        return rg_i_fail_no_memory(RG_HERE);

    kt_char_ptr_t p_data                 = nullptr;
    kt_char_ptr_t p_previous_free_record = nullptr;
    kt_uint32_t   actual_length          = 0;
    return rg_i_rb_lend_record(&p_table->record_buffer_pool, static_cast<kt_uint32_t>(length), &p_data,
                               &p_previous_free_record, &actual_length);
}

kt_int32_t rg_i_create_transient_table(rg_i_tree_t * p_tree, kt_char_ptr_t p_name, rg_column_t * p_columns,
                                       kt_uint32_t total_columns, kt_int32_t mode, rg_hash_table_t * p_rows_hash_table,
                                       rg_i_table_t ** p_table)
{
    rg_i_table_t * p_new_table = nullptr;
    if (const kt_int32_t rc = rg_i_create_transient_table_common(p_tree, p_name, p_columns, total_columns, mode,
                                                                 p_rows_hash_table, &p_new_table);
        rc != 0)
        return rc;
    if (const kt_int32_t rc = rg_i_reserve_room_for_rows(p_new_table); rc != 0) {
        rg_i_close_table(p_new_table);
        return rc;
    }
    // Kept because callers depend on it: a new table is open for writing, whatever mode was asked for.
    p_new_table->mode = RG_MODE_WRITE;
    *p_table          = p_new_table;
    return 0;
}

// ---- The metadata record in other forms ----

namespace
{

// The names lie behind the columns of the record p_names_data, which is laid out like the one that is converted.
[[nodiscard]] kt_int32_t convert_metadata(kt_char_ptr_t p_mem_record, kt_char_ptr_t p_names_data,
                                          kt_char_ptr_t * p_p_disk_metadata_record)
{
    const kt_uint32_t mem_length = rg_i_load<rg_i_record_metadata_t>(p_mem_record).record_length;
    kt_char_ptr_t     p_mem_data = p_mem_record + RG_I_RECORD_HEAD_LENGTH;
    const auto        head       = rg_i_load<rg_i_metadata_head_t>(p_mem_data);
    const kt_uint32_t disk_length =
        mem_length - RG_I_MEMORY_RECORD_EXCESS - RG_I_MEMORY_COLUMN_EXCESS * head.total_columns;

    auto * p_disk_record = static_cast<kt_char_ptr_t>(std::calloc(1, disk_length));
    if (p_disk_record == nullptr)
        return rg_i_fail_no_memory(RG_HERE);
    rg_i_store(p_disk_record, rg_i_disk_metadata_record_t{{disk_length, 0, RG_RECORD_TYPE_METADATA}, head});

    const auto *  p_columns      = reinterpret_cast<const rg_column_t *>(p_mem_data + metadata_head_length);
    const auto *  p_region       = reinterpret_cast<const kt_char_t *>(p_columns + head.total_columns);
    const auto *  p_names_region = p_names_data + (p_region - p_mem_data);
    kt_char_ptr_t p_to           = p_disk_record + sizeof(rg_i_disk_metadata_record_t);
    for (kt_uint32_t column = 0; column < head.total_columns; ++column, p_to += sizeof(rg_disk_column_t))
        rg_i_store(p_to, disk_column(p_columns[column], p_names_region));
    // Behind the columns the two forms are byte for byte the same, the spare zeros at the end included.
    std::memcpy(p_to, p_region, static_cast<size_t>(p_disk_record + disk_length - p_to));
    *p_p_disk_metadata_record = p_disk_record;
    return 0;
}

} // namespace

kt_int32_t rg_i_convert_metadata_memory_record_to_disk_record(kt_char_ptr_t   p_mem_record,
                                                              kt_char_ptr_t * p_p_disk_metadata_record)
{
    return convert_metadata(p_mem_record, p_mem_record + RG_I_RECORD_HEAD_LENGTH, p_p_disk_metadata_record);
}

kt_int32_t rg_i_convert_metadata_to_disk_record(const rg_i_table_t * p_table, kt_char_ptr_t * p_p_disk_metadata_record)
{
    return convert_metadata(p_table->p_metadata_record_data - RG_I_RECORD_HEAD_LENGTH, rg_i_names_record_data(p_table),
                            p_p_disk_metadata_record);
}

// The two below stand ready for moving a metadata record.
void rg_i_convert_columns_pointers_to_offsets(rg_i_table_t * p_table)
{
    const auto region = reinterpret_cast<std::uintptr_t>(rg_i_default_data(p_table));
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        rg_column_t & definition = p_table->p_columns[column];
        definition.name = reinterpret_cast<kt_char_ptr_t>(reinterpret_cast<std::uintptr_t>(definition.name) - region);
        if (definition.sd_defn != nullptr)
            definition.sd_defn =
                reinterpret_cast<rg_sd_def_t *>(reinterpret_cast<std::uintptr_t>(definition.sd_defn) - region);
    }
}

void rg_i_convert_columns_offsets_to_pointers(rg_i_table_t * p_table)
{
    const auto region = reinterpret_cast<std::uintptr_t>(rg_i_default_data(p_table));
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        rg_column_t & definition = p_table->p_columns[column];
        definition.name = reinterpret_cast<kt_char_ptr_t>(reinterpret_cast<std::uintptr_t>(definition.name) + region);
        if (definition.sd_defn != nullptr)
            definition.sd_defn =
                reinterpret_cast<rg_sd_def_t *>(reinterpret_cast<std::uintptr_t>(definition.sd_defn) + region);
    }
}
