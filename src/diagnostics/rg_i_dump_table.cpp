// SPDX-License-Identifier: MIT
// rg_i_dump_table: prints the inner state of a table, item by item, for a person who hunts a fault.
//
// Layer: diagnostics, exported under its own name. Only looks, but for one thing: printing the file's path sets the
// path buffer to the data file's name.
// Always holds: what is read is bounded by the record that it lies in, so that a damaged row prints less and not more.
// Locking: none. The caller keeps the table still, or takes what it gets.
// Failure: none. What a stream doesn't take is lost.
#include "diagnostics/rg_i_dump_table.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdint>

namespace
{

constexpr kt_uint32_t bytes_of_a_group    = 4;
constexpr kt_uint32_t groups_of_a_line    = 16;
constexpr kt_uint32_t qualifier_kind_mask = 15;

constexpr std::array type_names{"KT_UNKNOWN",
                                "KT_NONE",
                                "KT_INT32",
                                "KT_UINT32",
                                "KT_INT64",
                                "KT_UINT64",
                                "KT_FLOAT32",
                                "KT_FLOAT64",
                                "KT_CHAR_PTR",
                                "KT_BINARY_PTR",
                                "KT_RSRC_HANDLE_PTR",
                                "KT_SD_PTR",
                                "KT_SBS_PTR",
                                "KT_INT32_ARRAY",
                                "KT_UINT32_ARRAY",
                                "KT_INT64_ARRAY",
                                "KT_UINT64_ARRAY",
                                "KT_FLOAT32_ARRAY",
                                "KT_FLOAT64_ARRAY",
                                "KT_CHAR_PTR_ARRAY",
                                "KT_BINARY_PTR_ARRAY",
                                "KT_RSRC_HANDLE_PTR_ARRAY",
                                "KT_SD_PTR_ARRAY"};
static_assert(type_names.size() == KT_SD_PTR_ARRAY + 1);

constexpr std::array qualifier_names{"RG_UNKNOWN_QUALIFIER", "RG_SYSTEM", "RG_STANDARD", "RG_PRIMARY_KEY",
                                     "RG_PRIMARY_KEY_NOCHECK"};
static_assert(qualifier_names.size() == RG_PRIMARY_KEY_NOCHECK + 1);

// Where a dump goes, and what of it is wanted.
struct dump_t {
    FILE *      p_stream;
    kt_uint64_t detail_flags;
};

// Pointers print with their low 32 bits: enough to tell the objects of one dump apart.
[[nodiscard]] kt_uint32_t low_bits(const void * p)
{
    return static_cast<kt_uint32_t>(reinterpret_cast<std::uintptr_t>(p));
}

void dump_number(const dump_t & dump, kt_uint64_t required_detail, const kt_char_t * p_name, kt_uint32_t number)
{
    rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "  %s(%u)\n", p_name, number);
}

void dump_signed(const dump_t & dump, kt_uint64_t required_detail, const kt_char_t * p_name, kt_int32_t number)
{
    rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "  %s(%d)\n", p_name, number);
}

void dump_counter(const dump_t & dump, kt_uint64_t required_detail, const kt_char_t * p_name, kt_uint64_t number)
{
    rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "  %s(%llu)\n", p_name,
                static_cast<unsigned long long>(number));
}

void dump_pointer(const dump_t & dump, const kt_char_t * p_name, const void * p)
{
    rg_i_printf(RG_I_DUMP_POINTERS, dump.detail_flags, dump.p_stream, "  %s(0x%.8x)\n", p_name, low_bits(p));
}

// ---- Values ----

// Indirect data, and how much of it there is.
struct region_t {
    const kt_char_t * p_first;
    kt_uint32_t       length;
};

// The bytes that an anchor names, as far as they lie in the region.
[[nodiscard]] region_t anchored(const region_t & region, const kt_pmsg_value_anchor_t & anchor)
{
    const kt_uint32_t offset = std::min<kt_uint32_t>(anchor.offset, region.length);
    return {region.p_first + offset, std::min<kt_uint32_t>(anchor.length, region.length - offset)};
}

// One stored value, from its eight bytes and its indirect data.
void dump_value(const dump_t & dump, kt_uint64_t required_detail, kt_data_type_t type, const void * p_slot,
                const region_t & indirect, const kt_char_t * p_indent_prefix)
{
    const auto print = [&](const kt_char_t * p_text) {
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%s", p_text);
    };
    kt_value_t             value;
    kt_pmsg_value_anchor_t anchor;
    static_assert(sizeof value == sizeof anchor);
    std::memcpy(&value, p_slot, sizeof value);
    std::memcpy(&anchor, p_slot, sizeof anchor);

    switch (type) {
    case KT_UNKNOWN:
    case KT_NONE:
        print(rg_i_get_type_string(type));
        return;
    case KT_INT32:
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%d", value.val_int32);
        return;
    case KT_UINT32:
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%u", value.val_uint32);
        return;
    case KT_INT64:
    case KT_UINT64: // Kept because callers depend on it: the unsigned type prints as signed.
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%lld", static_cast<long long>(value.val_int64));
        return;
    case KT_FLOAT32:
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%g", static_cast<double>(value.val_float32));
        return;
    case KT_FLOAT64:
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%g", value.val_float64);
        return;
    case KT_CHAR_PTR: {
        const region_t bytes = anchored(indirect, {anchor.offset, UINT32_MAX});
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "%.*s",
                    static_cast<int>(std::min<kt_uint32_t>(bytes.length, INT32_MAX)), bytes.p_first);
        return;
    }
    default:
        break;
    }
    if (type > KT_SD_PTR_ARRAY) {
        print("GARBAGE");
        return;
    }
    rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "length(%u) data:\n", anchor.length);
    const region_t bytes = anchored(indirect, anchor);
    rg_i_dump_storage(bytes.p_first, bytes.length, groups_of_a_line, p_indent_prefix, dump.p_stream, dump.detail_flags,
                      required_detail);
}

// ---- Columns ----

void dump_modifiers(const dump_t & dump, rg_qualifier_t qualifier)
{
    if (qualifier <= qualifier_kind_mask)
        return;
    constexpr struct {
        rg_qualifier_t    bit;
        const kt_char_t * p_name;
    } modifiers[]{{RG_PROTECTED, "RG_PROTECTED"},
                  {RG_INVISIBLE, "RG_INVISIBLE"},
                  {RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED, "RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED"}};

    const auto print = [&](const kt_char_t * p_first, const kt_char_t * p_second) {
        rg_i_printf(RG_I_DUMP_COLUMN_MODIFIERS, dump.detail_flags, dump.p_stream, "%s%s", p_first, p_second);
    };
    print("    qualifier_modifiers(", "");
    const kt_char_t * p_separator = "";
    for (const auto & modifier : modifiers) {
        if ((qualifier & modifier.bit) == 0)
            continue;
        print(p_separator, modifier.p_name);
        p_separator = "|";
    }
    print(")", "\n");
}

// The packed definition in the metadata record: a count, and for each field its type and its name. The record of a copy
// leads to the one that it was copied from.
void dump_definition(const dump_t & dump, const rg_i_table_t * p_table, const rg_sd_def_t * p_definition)
{
    constexpr kt_uint64_t bit = RG_I_DUMP_COLUMN_DEFINITION;
    rg_i_printf(bit, dump.detail_flags, dump.p_stream, "    sd_defn(0x%.8x)\n", low_bits(p_definition));
    if (p_definition == nullptr || (bit & dump.detail_flags) == 0)
        return;

    const kt_char_t * const p_record = rg_i_names_record_data(p_table);
    const kt_char_t * const p_end    = p_record + rg_i_record_data_length(p_record);
    const auto *            p        = reinterpret_cast<const kt_char_t *>(p_definition);
    const kt_uint32_t       fields   = rg_i_load_u32(p);
    p += sizeof fields;
    rg_i_printf(bit, dump.detail_flags, dump.p_stream, "        number_of_fields(%u)\n", fields);
    for (kt_uint32_t field = 0; field < fields && p_end - p > static_cast<ptrdiff_t>(sizeof(kt_uint32_t)); ++field) {
        const kt_data_type_t type = rg_i_load_u32(p);
        p += sizeof type;
        const auto length = static_cast<int>(strnlen(p, static_cast<size_t>(p_end - p)));
        rg_i_printf(bit, dump.detail_flags, dump.p_stream, "            type(%s)\n", rg_i_get_type_string(type));
        rg_i_printf(bit, dump.detail_flags, dump.p_stream, "            name(%.*s)\n", length, p);
        p += length + 1;
    }
}

void dump_column_definition(const dump_t & dump, const rg_i_table_t * p_table, kt_uint32_t column)
{
    const rg_column_t & definition = p_table->p_columns[column];
    const auto [p_stream, flags]   = dump;
    rg_i_printf(RG_I_DUMP_COLUMN, flags, p_stream, "  column(%u)\n", column);
    rg_i_printf(RG_I_DUMP_COLUMN_NAME, flags, p_stream, "    name(%s)\n", definition.name);
    rg_i_printf(RG_I_DUMP_COLUMN_TYPE, flags, p_stream, "    type(%s)\n", rg_i_get_type_string(definition.type));
    rg_i_printf(RG_I_DUMP_COLUMN_QUALIFIER, flags, p_stream, "    qualifier(%s)\n",
                rg_i_get_qualifier_type_string(definition.qualifier));
    dump_modifiers(dump, definition.qualifier);
    rg_i_printf(RG_I_DUMP_COLUMN_PROPERTIES, flags, p_stream, "    properties(%d)\n", definition.properties);
    dump_definition(dump, p_table, definition.sd_defn);
    rg_i_printf(RG_I_DUMP_COLUMN_DEFAULT, flags, p_stream, "    default_value: ");
    dump_value(dump, RG_I_DUMP_COLUMN_DEFAULT, definition.type, &definition.default_value,
               {rg_i_default_data(p_table), rg_i_default_data_length(p_table)}, "    ");
    rg_i_printf(RG_I_DUMP_COLUMN_DEFAULT, flags, p_stream, "\n");
}

// ---- Rows ----

void dump_row_record(const dump_t & dump, const rg_i_table_t * p_table, kt_uint64_t required_detail,
                     const kt_char_t * p_which, kt_char_ptr_t p_record_data)
{
    if (p_record_data == nullptr) {
        rg_i_printf(required_detail, dump.detail_flags, dump.p_stream, "    %s ROW RECORD: NONE\n", p_which);
        return;
    }
    rg_i_printf(required_detail, dump.detail_flags, dump.p_stream,
                "    %s ROW RECORD: replaces_offset(%u), COLUMN VALUES:\n", p_which, rg_i_load_u32(p_record_data));
    dump_columns(p_table, p_record_data, "      ", dump.p_stream, dump.detail_flags, required_detail);
}

void dump_rows(const dump_t & dump, const rg_i_table_t * p_table)
{
    for (kt_uint32_t slot = 0; slot < p_table->maximum_rows; ++slot) {
        const rg_i_index_entry_t & entry = p_table->p_rows_fixed_index[slot];
        if (entry.p_applied == nullptr && entry.p_committed == nullptr)
            continue;
        rg_i_printf(RG_I_DUMP_ROW, dump.detail_flags, dump.p_stream,
                    "  row(%u) p_applied(0x%x) p_committed(0x%x) p_pending_change(0x%x) file_offset(%u) "
                    "applied_file_offset(%u)\n",
                    slot, low_bits(entry.p_applied), low_bits(entry.p_committed), low_bits(entry.p_pending_change),
                    entry.file_offset, entry.applied_file_offset);
        dump_row_record(dump, p_table, RG_I_DUMP_APPLIED_RECORD, "APPLIED", entry.p_applied);
        dump_row_record(dump, p_table, RG_I_DUMP_COMMITTED_RECORD, "COMMITTED", entry.p_committed);
    }
}

// ---- The table's own fields ----

void dump_fields_in_memory(const dump_t & dump, const rg_i_table_t * p_table)
{
    dump_pointer(dump, "p_metadata_record_data", p_table->p_metadata_record_data);
    dump_pointer(dump, "p_columns", p_table->p_columns);
    dump_number(dump, RG_I_DUMP_VARIABLE_COLUMNS, "total_variable_length_columns",
                p_table->total_variable_length_columns);
    dump_pointer(dump, "p_rows_fixed_index", p_table->p_rows_fixed_index);
    dump_pointer(dump, "p_rows_packed_index", p_table->p_rows_packed_index);
    dump_pointer(dump, "p_rows_change_list", p_table->p_rows_change_list);
    dump_pointer(dump, "p_rows_change_list_tail", p_table->p_rows_change_list_tail);
    dump_pointer(dump, "p_delete_rows_change_list", p_table->p_delete_rows_change_list);
    dump_pointer(dump, "p_delete_rows_change_list_tail", p_table->p_delete_rows_change_list_tail);
    dump_number(dump, RG_I_DUMP_CONTROL, "implicitly_controlled", p_table->implicitly_controlled);
    dump_number(dump, RG_I_DUMP_VISIBILITY, "uncommitted_updates_visible", p_table->uncommitted_updates_visible);
    dump_counter(dump, RG_I_DUMP_CHANGE_COUNTER, "change_counter", p_table->change_counter);
    dump_counter(dump, RG_I_DUMP_APPLIED_COUNTER, "applied_change_counter", p_table->applied_change_counter);
    dump_pointer(dump, "p_tree", p_table->p_tree);
    dump_pointer(dump, "p_next", p_table->p_next);
}

void dump_fields_of_file(const dump_t & dump, rg_i_table_t * p_table)
{
    constexpr kt_uint64_t bit = RG_I_DUMP_FILE;
    dump_number(dump, bit, "mode", p_table->mode);
    dump_number(dump, bit, "block_size", p_table->block_size);
    dump_number(dump, bit, "ready_for_commit", p_table->ready_for_commit);
    dump_signed(dump, bit, "file_fd", p_table->file_fd);
    dump_signed(dump, bit, "rewrite_file_fd", p_table->rewrite_file_fd);

    // Kept because callers depend on it: the two halves of this line have different bits, so that the first one alone
    // leaves it without an end.
    rg_i_printf(RG_I_DUMP_POINTERS, dump.detail_flags, dump.p_stream, "  p_file_path(0x%.8x)",
                low_bits(p_table->p_file_path));
    if (p_table->p_file_path == nullptr)
        rg_i_printf(bit, dump.detail_flags, dump.p_stream, "\n");
    else if ((bit & dump.detail_flags) != 0)
        rg_i_printf(bit, dump.detail_flags, dump.p_stream, " file_path(%s)\n", rg_i_set_data_path(p_table));

    dump_number(dump, bit, "file_path_length", p_table->file_path_length);
    dump_number(dump, bit, "commit_record_offset", p_table->commit_record_offset);
    dump_number(dump, bit, "applied_commit_record_offset", p_table->applied_commit_record_offset);
    dump_number(dump, bit, "commit_record_length", p_table->commit_record_length);
    dump_number(dump, bit, "applied_commit_record_length", p_table->applied_commit_record_length);
    dump_number(dump, bit, "file_length", p_table->file_length);
    dump_number(dump, bit, "rewrite_file_length", p_table->rewrite_file_length);
    const kt_char_t * p_registry_path = p_table->p_persistent_table_registry_path;
    rg_i_printf(bit, dump.detail_flags, dump.p_stream, "  p_persistent_table_registry_path(%s)\n",
                p_registry_path != nullptr ? p_registry_path : "");
}

// ---- Application metadata ----

// A version is a length and the bytes.
void dump_version(const dump_t & dump, const kt_char_t * p_which, const kt_char_t * p_version)
{
    constexpr kt_uint64_t bit = RG_I_DUMP_APPLICATION_METADATA;
    if (p_version == nullptr) {
        rg_i_printf(bit, dump.detail_flags, dump.p_stream, "        %s: NONE\n", p_which);
        return;
    }
    const kt_uint32_t length = rg_i_load_u32(p_version);
    rg_i_printf(bit, dump.detail_flags, dump.p_stream, "        %s: length(%u), data:\n", p_which, length);
    rg_i_dump_storage(p_version + sizeof length, length, groups_of_a_line, "        ", dump.p_stream, dump.detail_flags,
                      bit);
    rg_i_printf(bit, dump.detail_flags, dump.p_stream, "\n");
}

void dump_application_metadata(const dump_t & dump, const rg_i_application_metadata_t * p_metadata)
{
    constexpr kt_uint64_t bit    = RG_I_DUMP_APPLICATION_METADATA;
    const auto [p_stream, flags] = dump;
    rg_i_printf(bit, flags, p_stream, "  p_application_metadata(0x%.8x)\n", low_bits(p_metadata));
    if (p_metadata == nullptr)
        return;
    rg_i_printf(bit, flags, p_stream, "    max_elements(%u)\n", p_metadata->max_elements);
    rg_i_printf(bit, flags, p_stream, "    total_elements(%u)\n", p_metadata->total_elements);
    for (kt_uint32_t i = 0; i < p_metadata->total_elements; ++i) {
        const rg_i_application_metadata_index_element_t & element = p_metadata->p_index[i];
        rg_i_printf(bit, flags, p_stream, "      %u: type(%u) p_applied(0x%.8x) p_committed(0x%.8x)\n", i, element.type,
                    low_bits(element.p_applied), low_bits(element.p_committed));
        dump_version(dump, "APPLIED", element.p_applied);
        dump_version(dump, "COMMITTED", element.p_committed);
    }
}

// ---- The pool ----

// What a walk of records sums up.
struct pool_sums_t {
    kt_uint32_t total_bytes;
    kt_uint32_t used_bytes;
};

[[nodiscard]] pool_sums_t dump_records(const dump_t & dump, const rg_i_record_buffer_t * p_buffer)
{
    pool_sums_t       sums{RG_I_RECORD_BUFFER_HEAD_LENGTH, RG_I_RECORD_BUFFER_HEAD_LENGTH};
    const auto *      p     = reinterpret_cast<const kt_char_t *>(p_buffer) + RG_I_RECORD_BUFFER_HEAD_LENGTH;
    const kt_uint32_t total = p_buffer->total_bytes;
    for (kt_uint32_t number = 0; sums.total_bytes < total; ++number) {
        rg_i_record_metadata_t head;
        std::memcpy(&head, p, sizeof head);
        if (head.record_length < sizeof head || head.record_length > total - sums.total_bytes)
            break; // the pool is damaged
        rg_i_printf(RG_I_DUMP_POOL, dump.detail_flags, dump.p_stream,
                    "    record(%u:0x%.8x) length(%u) type(%d) p_next_free(0x%.8x)\n", number, low_bits(p),
                    head.record_length, static_cast<kt_int32_t>(head.type), low_bits(head.p_next));
        sums.total_bytes += head.record_length;
        sums.used_bytes += head.type != RG_RECORD_TYPE_FREE ? head.record_length : RG_I_RECORD_HEAD_LENGTH;
        p += head.record_length;
    }
    return sums;
}

} // namespace

int rg_i_printf(kt_uint64_t required_detail, kt_uint64_t detail_flags, FILE * p_stream, const kt_char_t * p_format, ...)
{
    if ((required_detail & detail_flags) == 0)
        return 0;
    va_list arguments;
    va_start(arguments, p_format);
    const int result = std::vfprintf(p_stream, p_format, arguments);
    va_end(arguments);
    std::fflush(p_stream);
    return result;
}

void rg_i_dump_storage(const void * start, kt_uint32_t length, kt_uint32_t width, const kt_char_t * p_indent_prefix,
                       FILE * p_stream, kt_uint64_t detail_flags, kt_uint64_t required_detail)
{
    const kt_uint32_t line_length = std::max(width, 1u) * bytes_of_a_group;
    const auto *      p           = static_cast<const kt_uint8_t *>(start);
    if ((required_detail & detail_flags) == 0)
        return;
    while (length > 0) {
        if (p_indent_prefix != nullptr)
            rg_i_printf(required_detail, detail_flags, p_stream, "%s", p_indent_prefix);
        rg_i_printf(required_detail, detail_flags, p_stream, "%p", static_cast<const void *>(p));
        const kt_uint32_t bytes = std::min(length, line_length);
        for (kt_uint32_t i = 0; i < bytes; ++i)
            rg_i_printf(required_detail, detail_flags, p_stream, "%.2x%s", static_cast<unsigned>(p[i]),
                        (i + 1) % bytes_of_a_group == 0 ? " " : "");
        p += bytes;
        length -= bytes;
        if (length > 0)
            rg_i_printf(required_detail, detail_flags, p_stream, "\n");
    }
}

const kt_char_t * rg_i_get_type_string(kt_data_type_t type)
{
    return type < type_names.size() ? type_names[type] : "GARBAGE";
}

const kt_char_t * rg_i_get_qualifier_type_string(rg_qualifier_t qualifier)
{
    const kt_uint32_t kind = qualifier & qualifier_kind_mask;
    return kind < qualifier_names.size() ? qualifier_names[kind] : "GARBAGE";
}

kt_int32_t dump_columns(const rg_i_table_t * p_table, kt_char_ptr_t p_record_data, const kt_char_t * p_indent_prefix,
                        FILE * p_stream, kt_uint64_t detail_flags, kt_uint64_t required_detail)
{
    if ((required_detail & detail_flags) == 0)
        return 0;
    const dump_t   dump{p_stream, detail_flags};
    const region_t indirect{rg_i_row_indirect_data(p_record_data, p_table->total_columns),
                            rg_i_row_indirect_length(p_table, p_record_data)};
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
        if (p_indent_prefix != nullptr)
            rg_i_printf(required_detail, detail_flags, p_stream, "%s", p_indent_prefix);
        rg_i_printf(required_detail, detail_flags, p_stream, "column(%u): ", column);
        dump_value(dump, required_detail, p_table->p_columns[column].type, rg_i_row_slot(p_record_data, column),
                   indirect, p_indent_prefix);
        rg_i_printf(required_detail, detail_flags, p_stream, "\n");
    }
    return 0;
}

kt_int32_t dump_record_buffer_pool(const rg_i_record_buffer_pool_t * p_record_buffer_pool, FILE * p_stream,
                                   kt_uint64_t detail_flags)
{
    constexpr kt_uint64_t bit = RG_I_DUMP_POOL;
    if ((bit & detail_flags) == 0)
        return 0;
    const dump_t                      dump{p_stream, detail_flags};
    const rg_i_record_buffer_pool_t & pool = *p_record_buffer_pool;
    rg_i_printf(bit, detail_flags, p_stream, "record buffer pool address(0x%.8x)\n", low_bits(&pool));
    dump_number(dump, bit, "total_bytes", pool.total_bytes);
    dump_number(dump, bit, "used_bytes", pool.used_bytes);
    rg_i_printf(bit, detail_flags, p_stream, "  p_free_chain(0x%.8x)\n", low_bits(pool.p_free_chain));
    rg_i_printf(bit, detail_flags, p_stream, "  p_first_record_buffer(0x%.8x)\n", low_bits(pool.p_first_record_buffer));
    rg_i_printf(bit, detail_flags, p_stream, "  p_last_record_buffer(0x%.8x)\n", low_bits(pool.p_last_record_buffer));

    pool_sums_t cumulative{0, 0};
    kt_uint32_t number = 0;
    for (const rg_i_record_buffer_t * p_buffer = pool.p_first_record_buffer; p_buffer != nullptr;
         p_buffer                              = p_buffer->p_next, ++number) {
        rg_i_printf(bit, detail_flags, p_stream, "  record_buffer(%u:0x%.8x)\n", number, low_bits(p_buffer));
        rg_i_printf(bit, detail_flags, p_stream, "    total_bytes(%u)\n", p_buffer->total_bytes);
        rg_i_printf(bit, detail_flags, p_stream, "    p_next(0x%.8x)\n", low_bits(p_buffer->p_next));
        const pool_sums_t sums = dump_records(dump, p_buffer);
        rg_i_printf(bit, detail_flags, p_stream, "    total_bytes(%u)\n", sums.total_bytes);
        rg_i_printf(bit, detail_flags, p_stream, "    used_bytes(%u)\n", sums.used_bytes);
        cumulative.total_bytes += sums.total_bytes;
        cumulative.used_bytes += sums.used_bytes;
    }
    dump_number(dump, bit, "cumulative_total_bytes", cumulative.total_bytes);
    dump_number(dump, bit, "cumulative_used_bytes", cumulative.used_bytes);
    return 0;
}

extern "C" kt_int32_t rg_i_dump_table(rg_i_table_t * p_table, FILE * p_stream, kt_uint64_t detail_flags)
{
    const dump_t dump{p_stream, detail_flags};
    rg_i_printf(RG_I_DUMP_ALL, detail_flags, p_stream, "Table p_table(0x%.8x)\n", low_bits(p_table));
    if (p_table == nullptr)
        return 0;

    rg_i_printf(RG_I_DUMP_NAME, detail_flags, p_stream, "  p_name(%s)\n",
                p_table->p_name != nullptr ? p_table->p_name : "UNNAMED TABLE");
    dump_number(dump, RG_I_DUMP_REFERENCES, "references", p_table->references);
    dump_number(dump, RG_I_DUMP_TOTAL_COLUMNS, "total_columns", p_table->total_columns);
    for (kt_uint32_t column = 0; column < p_table->total_columns; ++column)
        dump_column_definition(dump, p_table, column);

    rg_i_printf(RG_I_DUMP_ROW_COUNTERS, detail_flags, p_stream,
                "  total_applied_rows(%u) total_committed_rows(%u) maximum_rows(%u)\n", p_table->total_applied_rows,
                p_table->total_committed_rows, p_table->maximum_rows);
    dump_number(dump, RG_I_DUMP_ROW_COUNTERS, "applied_deletions", p_table->applied_deletions);
    dump_rows(dump, p_table);

    dump_fields_in_memory(dump, p_table);
    dump_fields_of_file(dump, p_table);
    dump_application_metadata(dump, p_table->p_application_metadata);
    return dump_record_buffer_pool(&p_table->record_buffer_pool, p_stream, detail_flags);
}
