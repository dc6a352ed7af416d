// SPDX-License-Identifier: MIT
// Creating tables in memory: which columns are legal, where the key goes, and what the metadata record looks like.
#include <cstdlib>

#include "parts.h"
#include "support/allocations.h"

using namespace kt_test;

namespace
{

rg_column_t key_column()
{
    return column("id", KT_UINT32, RG_PRIMARY_KEY);
}

// Code of creating a table with these columns.
kt_int32_t code_of(std::vector<rg_column_t> columns)
{
    open_tree  tree;
    kt_int32_t rc = -1;
    create_table(tree, "t", std::move(columns), RG_MODE_WRITE, &rc);
    if (rc != 0) {
        EXPECT_EQ(error_code(), rc);
    }
    return rc;
}

kt_int32_t code_of_name(const std::string & name)
{
    return code_of({key_column(), column(name, KT_INT32)});
}

kt_int32_t code_of_key(kt_data_type_t type)
{
    return code_of({column("k", type, RG_PRIMARY_KEY, null_value())});
}

// A definition with these fields, which lives as long as the object.
class definition
{
  public:
    explicit definition(const std::vector<std::pair<kt_data_type_t, std::string>> & fields)
        : memory_(sizeof(rg_sd_def_t) + fields.size() * sizeof(rg_field_def_t))
    {
        get()->number_of_fields = static_cast<kt_uint32_t>(fields.size());
        for (size_t i = 0; i < fields.size(); ++i)
            this->fields()[i] = {fields[i].first, text(fields[i].second)};
    }
    rg_sd_def_t *    get() { return reinterpret_cast<rg_sd_def_t *>(memory_.data()); }
    rg_field_def_t * fields() { return get()->fields; }

  private:
    std::vector<char> memory_;
};

rg_column_t sd_column(const std::string & name, kt_data_type_t type, rg_sd_def_t * p_definition)
{
    rg_column_t result = column(name, type, RG_STANDARD, null_value());
    result.sd_defn     = p_definition;
    return result;
}

// The indirect default of a column of a table.
std::string stored_default(const rg_i_table_t & table, kt_uint32_t column)
{
    kt_pmsg_value_anchor_t where;
    std::memcpy(&where, &table.p_columns[column].default_value, sizeof where);
    EXPECT_LE(where.offset + where.length, rg_i_default_data_length(&table));
    return std::string(rg_i_default_data(&table) + where.offset, where.length);
}

bytes metadata_of(const rg_i_table_t & table)
{
    const auto * p = reinterpret_cast<const std::uint8_t *>(table.p_metadata_record_data);
    return bytes(p, p + rg_i_record_data_length(table.p_metadata_record_data));
}

struct environment_variable {
    environment_variable(const char * p_name, const char * p_value) : p_name_(p_name) { setenv(p_name, p_value, 1); }
    ~environment_variable() { unsetenv(p_name_); }
    const char * p_name_;
};

} // namespace

// ---- Which columns are legal ----

TEST(a_column_name, of_255_bytes_is_accepted_and_of_256_refused)
{
    EXPECT_EQ(code_of_name("a" + std::string(254, 'b')), 0);
    EXPECT_EQ(code_of_name("a" + std::string(255, 'b')), RG_E_INVALID_COLUMN);
    EXPECT_EQ(code_of_name(""), RG_E_INVALID_COLUMN);
}

TEST(a_column_name, is_a_letter_and_then_letters_digits_and_underscores)
{
    EXPECT_EQ(code_of_name("a_1"), 0);
    EXPECT_EQ(code_of_name("Z"), 0);
    for (const char * p_name : {"1a", "_a", "a-b", "a b", " a", "a\tb", "a.b", "a/b", "a,b", "\xC3\xA4"})
        EXPECT_EQ(code_of_name(p_name), RG_E_INVALID_COLUMN) << p_name;
    rg_column_t nameless = column("x", KT_INT32);
    nameless.name        = nullptr;
    EXPECT_EQ(code_of({key_column(), nameless}), RG_E_INVALID_COLUMN);
}

TEST(a_column_type, is_from_int32_to_an_array_of_structured_data)
{
    for (const kt_data_type_t type : {0u, 1u, 23u, 0xFFFFFFFFu})
        EXPECT_EQ(code_of({key_column(), column("c", type)}), RG_E_INVALID_COLUMN) << type;
    definition fields({{KT_INT32, "f"}});
    for (kt_data_type_t type = KT_INT32; type <= KT_SD_PTR_ARRAY; ++type)
        EXPECT_EQ(code_of({key_column(), sd_column("c", type, fields.get())}), 0) << type;
}

TEST(a_column_qualifier, is_standard_or_key_with_any_modifiers_and_system_is_refused)
{
    for (const rg_qualifier_t qualifier : {0u, 1u, 5u, 15u, 1u + 16, 0u + 64})
        EXPECT_EQ(code_of({key_column(), column("c", KT_INT32, qualifier)}), RG_E_INVALID_COLUMN) << qualifier;

    open_tree                      tree;
    const std::vector<rg_column_t> columns = {column("k", KT_INT32, RG_PRIMARY_KEY_NOCHECK | RG_PROTECTED),
                                              column("a", KT_INT32, RG_STANDARD | RG_PROTECTED),
                                              column("b", KT_INT32, RG_STANDARD | RG_INVISIBLE),
                                              column("c", KT_INT32, RG_STANDARD | RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED)};
    const rg_i_table_t &           table   = object(create_table(tree, "t", columns, RG_MODE_WRITE));
    for (size_t i = 0; i < columns.size(); ++i)
        EXPECT_EQ(table.p_columns[i].qualifier, columns[i].qualifier);
}

TEST(a_structured_data_column, needs_a_definition_whose_fields_have_names)
{
    for (const kt_data_type_t type : {KT_SD_PTR, KT_SD_PTR_ARRAY}) {
        EXPECT_EQ(code_of({key_column(), sd_column("c", type, nullptr)}), RG_E_INVALID_COLUMN);
        definition nameless({{KT_INT32, "f"}, {KT_INT32, "g"}});
        nameless.fields()[1].name = nullptr;
        EXPECT_EQ(code_of({key_column(), sd_column("c", type, nameless.get())}), RG_E_INVALID_COLUMN);
        definition empty({});
        EXPECT_EQ(code_of({key_column(), sd_column("c", type, empty.get())}), 0);
    }
}

TEST(a_key, is_a_number_a_string_or_a_resource_handle)
{
    for (kt_data_type_t type = KT_INT32; type <= KT_SD_PTR_ARRAY; ++type) {
        const bool legal = type <= KT_CHAR_PTR || type == KT_RSRC_HANDLE_PTR;
        EXPECT_EQ(code_of_key(type), legal ? 0 : RG_E_INVALID_COLUMN) << type;
    }
}

TEST(a_table, has_exactly_one_key_column)
{
    EXPECT_EQ(code_of({column("a", KT_INT32)}), RG_E_KEY_EXPECTED);
    EXPECT_EQ(code_of({key_column(), column("b", KT_INT32, RG_PRIMARY_KEY)}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(code_of({key_column(), column("b", KT_INT32, RG_PRIMARY_KEY_NOCHECK)}), RG_E_DUPLICATE_KEY);
}

TEST(a_table, has_columns_of_different_names)
{
    EXPECT_EQ(code_of({key_column(), column("a", KT_INT32), column("b", KT_INT32), column("a", KT_INT64)}),
              RG_E_DUPLICATE_COLUMN);
    EXPECT_EQ(code_of({key_column(), column("a", KT_INT32), column("A", KT_INT32)}), 0);
}

TEST(a_table, has_columns)
{
    open_tree          tree;
    rg_opaque_handle_t handle   = tree; // any value that must stay
    rg_column_t        a_column = key_column();
    EXPECT_EQ(rg_create_table_1(tree, text("t"), &a_column, 0, RG_MODE_WRITE, &handle), RG_E_NO_COLUMNS);
    EXPECT_EQ(rg_create_table_1(tree, text("t"), nullptr, 0, RG_MODE_WRITE, &handle), RG_E_NO_COLUMNS);
    EXPECT_EQ(rg_create_table_1(tree, text("t"), nullptr, 1, RG_MODE_WRITE, &handle), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(handle, static_cast<rg_opaque_handle_t>(tree));
}

TEST(refused_columns, are_reported_in_the_order_of_the_checks)
{
    // An invalid column goes ahead of the number of keys, and that ahead of equal names.
    EXPECT_EQ(code_of({column("a", KT_INT32), column("a", KT_NONE)}), RG_E_INVALID_COLUMN);
    EXPECT_EQ(code_of({column("a", KT_INT32), column("a", KT_INT32)}), RG_E_KEY_EXPECTED);
    EXPECT_EQ(code_of({key_column(), key_column()}), RG_E_DUPLICATE_KEY);
}

TEST(refused_columns, cost_no_allocation_and_leave_order_and_defaults_untouched)
{
    const rg_column_t long_default = column("s", KT_CHAR_PTR, RG_STANDARD, string("kept"));
    for (const rg_column_t & last : {column("bad name", KT_INT32), column("s", KT_INT32), column("z", KT_INT32)}) {
        std::vector<rg_column_t> columns = {long_default, column("b", KT_INT32), last};
        if (last.name[0] == 's')
            columns[1].qualifier = RG_PRIMARY_KEY;
        const std::vector<rg_column_t> before  = columns;
        rg_i_table_t *                 p_table = nullptr;
        fault_scope                    faults;
        EXPECT_NE(rg_i_create_transient_table(nullptr, nullptr, columns.data(), 3, 0, nullptr, &p_table), 0);
        EXPECT_EQ(calls_made(call::allocation), 0u);
        EXPECT_EQ(std::memcmp(columns.data(), before.data(), 3 * sizeof(rg_column_t)), 0);
        EXPECT_STREQ(columns[0].default_value.ptr_char, "kept");
        EXPECT_EQ(p_table, nullptr);
    }
}

// ---- Where the columns go ----

TEST(the_key_column, changes_places_with_the_first_one_and_the_callers_array_is_as_before)
{
    std::vector<rg_column_t> columns = {
        column("a", KT_INT32, RG_STANDARD, int32(1)), column("b", KT_INT32, RG_STANDARD, int32(2)),
        column("k", KT_INT32, RG_PRIMARY_KEY, int32(3)), column("d", KT_INT32, RG_STANDARD, int32(4))};
    rg_i_table_t * p_table = nullptr;
    ASSERT_EQ(rg_i_create_transient_table(nullptr, nullptr, columns.data(), 4, 0, nullptr, &p_table), 0);
    const char * expected[] = {"k", "b", "a", "d"}; // one exchange, not a shift
    for (int i = 0; i < 4; ++i)
        EXPECT_STREQ(p_table->p_columns[i].name, expected[i]);
    EXPECT_EQ(p_table->p_columns[0].default_value.val_int32, 3);
    EXPECT_EQ(p_table->p_columns[2].default_value.val_int32, 1);
    const char * callers[] = {"a", "b", "k", "d"};
    for (int i = 0; i < 4; ++i)
        EXPECT_STREQ(columns[static_cast<size_t>(i)].name, callers[i]);
    rg_i_close_table(p_table);
}

TEST(the_callers_columns, get_their_order_back_on_every_failure)
{
    std::vector<rg_column_t> fresh = {column("s", KT_CHAR_PTR, RG_STANDARD, string("text")),
                                      column("k", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY, null_value())};
    std::vector<rg_column_t> columns;
    rg_i_table_t *           p_table = nullptr;
    fail_each_allocation(
        [&] {
            columns = fresh;
            p_table = nullptr;
            return rg_i_create_transient_table(nullptr, text("t"), columns.data(), 2, 0, nullptr, &p_table);
        },
        [&](kt_int32_t rc) {
            EXPECT_STREQ(columns[0].name, "s");
            EXPECT_STREQ(columns[1].name, "k");
            EXPECT_EQ(p_table != nullptr, rc == 0);
        });
    rg_i_close_table(p_table);
}

// ---- Defaults ----

TEST(a_table_without_indirect_columns, has_no_default_data)
{
    lone_table table({key_column(), column("v", KT_INT64, RG_STANDARD, int64(-7))});
    EXPECT_EQ(rg_i_default_data_length(table.get()), 0u);
    EXPECT_EQ(table->total_variable_length_columns, 0u);
    EXPECT_EQ(rg_i_load_u32(table->p_metadata_record_data + 12), 0u);
    EXPECT_EQ(table->p_columns[1].default_value.val_int64, -7);
}

TEST(packing_defaults, says_15_without_a_record_where_no_column_is_indirect)
{
    rg_column_t   columns[] = {key_column()};
    kt_char_ptr_t p_data    = text("x");
    kt_uint32_t   length    = 9;
    kt_uint32_t   count     = 9;
    ku_set_no_error_1();
    EXPECT_EQ(rg_i_pack_variable_length_default_values(columns, 1, &p_data, &length, &count, nullptr), RG_E_INTERNAL);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(p_data, nullptr);
    EXPECT_EQ(length, 0u);
    EXPECT_EQ(count, 0u);
}

TEST(indirect_defaults, stand_behind_the_columns_in_column_order)
{
    lone_table table({column("a", KT_CHAR_PTR, RG_STANDARD, string("first")), column("b", KT_INT32),
                      column("k", KT_CHAR_PTR, RG_PRIMARY_KEY, string("key"))});
    EXPECT_EQ(table->total_variable_length_columns, 2u);
    EXPECT_EQ(stored_default(*table.get(), 0), std::string("key\0", 4));
    EXPECT_EQ(stored_default(*table.get(), 2), std::string("first\0", 6));
    EXPECT_EQ(rg_i_default_data_length(table.get()), 10u);
    EXPECT_EQ(std::string(rg_i_default_data(table.get()), 10), std::string("key\0first\0", 10));
}

TEST(indirect_defaults, larger_than_the_buffer_make_it_double_as_often_as_needed)
{
    std::vector<rg_column_t> columns = {key_column()};
    for (const size_t length : {4094u, 1u, 4096u, 100000u, 70000u})
        columns.push_back(column("c" + std::to_string(columns.size()), KT_CHAR_PTR, RG_STANDARD,
                                 string(std::string(length, static_cast<char>('a' + columns.size())))));
    lone_table table(columns);
    for (kt_uint32_t i = 1; i < columns.size(); ++i) {
        const std::string stored = stored_default(*table.get(), i);
        EXPECT_EQ(stored, std::string(stored.size() - 1, static_cast<char>('a' + i)) + '\0');
    }
    EXPECT_EQ(stored_default(*table.get(), 1).size(), 4095u);
    EXPECT_EQ(stored_default(*table.get(), 4).size(), 100001u);
}

TEST(indirect_defaults, that_are_null_give_the_types_empty_value)
{
    std::vector<rg_column_t> columns = {key_column()};
    definition               fields({{KT_INT32, "f"}});
    for (kt_data_type_t type = KT_CHAR_PTR; type <= KT_SD_PTR_ARRAY; ++type)
        columns.push_back(sd_column("c" + std::to_string(type), type, fields.get()));
    lone_table table(columns);
    EXPECT_EQ(table->total_variable_length_columns, 15u);
    EXPECT_EQ(stored_default(*table.get(), 1), std::string(1, '\0'));
    for (kt_uint32_t i = 1; i < columns.size(); ++i) {
        kt_value_t value = uint64(0);
        ASSERT_EQ(kt_pmsg_build_conv_packed_client_value_1(
                      nullptr, 0, columns[i].type, &value, &table->p_columns[i].default_value,
                      rg_i_default_data(table.get()), rg_i_default_data_length(table.get())),
                  0);
        switch (columns[i].type) {
        case KT_CHAR_PTR:
            EXPECT_STREQ(value.ptr_char, "");
            break;
        case KT_RSRC_HANDLE_PTR:
            EXPECT_EQ(ku_rsrc_hndl_cmp_1(value.ptr_rsrc_handle, ku_ptr_invld_rsrc_hndl_1), 0);
            break;
        default: // a count or a length stands first in all others
            EXPECT_EQ(rg_i_load_u32(value.ptr_array), 0u) << columns[i].type;
        }
        std::free(value.ptr_char);
    }
}

TEST(indirect_defaults, are_anchors_in_the_callers_array_afterwards_so_that_it_must_be_refilled)
{
    std::vector<rg_column_t> columns = {key_column(), column("s", KT_CHAR_PTR, RG_STANDARD, string("abc")),
                                        column("n", KT_INT64, RG_STANDARD, int64(5))};
    open_tree                tree;
    rg_opaque_handle_t       handle = nullptr;
    ASSERT_EQ(rg_create_table_1(tree, text("t"), columns.data(), 3, RG_MODE_WRITE, &handle), 0);
    const kt_value_t expected = anchor(0, 4);
    EXPECT_EQ(columns[1].default_value.val_uint64, expected.val_uint64);
    EXPECT_EQ(columns[2].default_value.val_int64, 5);

    columns[1].default_value = string("refilled");
    ASSERT_EQ(rg_create_table_1(tree, text("u"), columns.data(), 3, RG_MODE_WRITE, &handle), 0);
    EXPECT_EQ(stored_default(object(handle), 1), std::string("refilled\0", 9));
}

TEST(indirect_defaults, that_cant_be_stored_are_a_library_failure)
{
    // Nested deeper than any reader would follow.
    std::vector<kt_structured_data_t> levels(KT_PMSG_MAXIMUM_NESTING + 2);
    for (size_t i = 0; i < levels.size(); ++i) {
        std::memset(&levels[i], 0, sizeof levels[i]);
        levels[i].element_count = i + 1 < levels.size() ? 1 : 0;
        if (i + 1 < levels.size())
            levels[i].elements[0] = {KT_SD_PTR, 0, {}};
        if (i + 1 < levels.size())
            levels[i].elements[0].value.ptr_sd = &levels[i + 1];
    }
    definition  fields({{KT_SD_PTR, "f"}});
    rg_column_t deep          = sd_column("deep", KT_SD_PTR, fields.get());
    deep.default_value.ptr_sd = &levels[0];
    rg_column_t columns[]  = {column("i", KT_INT32), column("s", KT_CHAR_PTR, RG_STANDARD, string("abc")), key_column(),
                              deep};
    rg_i_table_t * p_table = nullptr;
    EXPECT_EQ(rg_i_create_transient_table(nullptr, nullptr, columns, 4, 0, nullptr, &p_table), RG_E_LIBRARY_CALL);
    EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("kt_pmsg_build_conv_protocol_value"), std::string::npos) << error_text();
    EXPECT_STREQ(columns[0].name, "i") << "the order is restored";
    EXPECT_STREQ(columns[2].name, "id");
    EXPECT_EQ(columns[1].default_value.val_uint64, anchor(0, 4).val_uint64) << "earlier defaults are anchors";
    EXPECT_EQ(p_table, nullptr);
}

// ---- The metadata record ----

TEST(the_metadata_record, holds_head_columns_defaults_names_and_definitions)
{
    definition  fields({{KT_INT32, "x"}, {KT_CHAR_PTR, "long_name"}});
    rg_column_t sd = sd_column("sd", KT_SD_PTR, fields.get());
    rg_column_t v  = column("v", KT_INT64, RG_STANDARD, int64(9));
    v.properties   = -5;
    v.sd_defn      = fields.get(); // ignored for this type
    lone_table table({sd, key_column(), v});

    const kt_uint32_t default_length = rg_i_default_data_length(table.get());
    EXPECT_EQ(stored_default(*table.get(), 1).size(), default_length);
    // 16 + D + 40 N, each name with its terminator, and 8 + (4 + 2) + (4 + 10) for the definition.
    const kt_uint32_t length = 16 + default_length + 40 * 3 + 3 + 3 + 2 + 8 + 6 + 14;
    const bytes       record = metadata_of(*table.get());
    ASSERT_GE(record.size(), length);
    EXPECT_LT(record.size(), length + 22);
    EXPECT_EQ(rg_i_record_head(table->p_metadata_record_data)->type, +RG_RECORD_TYPE_METADATA);

    const std::uint8_t * p_head = record.data();
    EXPECT_EQ(rg_i_load_u32(p_head), 0u) << "a little-endian host";
    EXPECT_EQ(rg_i_load_u32(p_head + 4), 0u);
    EXPECT_EQ(rg_i_load_u32(p_head + 8), 3u);
    EXPECT_EQ(rg_i_load_u32(p_head + 12), 1u);
    EXPECT_EQ(static_cast<void *>(table->p_columns), table->p_metadata_record_data + 16);

    const bytes region(record.begin() + 16 + 120 + default_length, record.end());
    const bytes expected = from_hex("69 64 00" // id
                                    "73 64 00" // sd, and its definition: 2 fields
                                    "02 00 00 00"
                                    "02 00 00 00 78 00" // KT_INT32 x
                                    "08 00 00 00 6c 6f 6e 67 5f 6e 61 6d 65 00"
                                    "76 00"         // v
                                    "00 00 00 00"); // the spare bytes of the definition
    ASSERT_GE(region.size(), expected.size());
    EXPECT_EQ(to_hex(bytes(region.begin(), region.begin() + static_cast<long>(expected.size()))), to_hex(expected));

    EXPECT_STREQ(table->p_columns[0].name, "id");
    EXPECT_EQ(table->p_columns[0].sd_defn, nullptr);
    EXPECT_EQ(reinterpret_cast<char *>(table->p_columns[1].sd_defn), table->p_columns[1].name + 3);
    EXPECT_EQ(table->p_columns[2].sd_defn, nullptr) << "no definition for a type that has none";
    EXPECT_EQ(table->p_columns[2].properties, -5);
}

TEST(the_metadata_record, has_four_spare_zero_bytes_for_each_structured_data_column)
{
    definition    none({});
    lone_table    plain({key_column(), column("a", KT_INT32), column("b", KT_INT32)});
    lone_table    with({key_column(), sd_column("a", KT_SD_PTR, none.get()), sd_column("b", KT_SD_PTR, none.get())});
    kt_char_ptr_t p_plain = nullptr;
    kt_char_ptr_t p_with  = nullptr;
    ASSERT_EQ(rg_i_convert_metadata_memory_record_to_disk_record(plain->p_metadata_record_data - 20, &p_plain), 0);
    ASSERT_EQ(rg_i_convert_metadata_memory_record_to_disk_record(with->p_metadata_record_data - 20, &p_with), 0);
    const kt_uint32_t defaults = rg_i_default_data_length(with.get());
    EXPECT_EQ(rg_i_load_u32(p_with), rg_i_load_u32(p_plain) + defaults + 2 * (4 + 4)) << "count and spare";
    const kt_uint32_t length = rg_i_load_u32(p_with);
    for (kt_uint32_t i = length - 8; i < length; ++i)
        EXPECT_EQ(p_with[i], 0);
    std::free(p_plain);
    std::free(p_with);
}

TEST(the_metadata_record, in_the_form_of_the_file_is_the_worked_examples)
{
    lone_table    table({column("id", KT_UINT32, RG_PRIMARY_KEY), column("val", KT_INT64)});
    kt_char_ptr_t p_disk = nullptr;
    ASSERT_EQ(rg_i_convert_metadata_memory_record_to_disk_record(table->p_metadata_record_data - 20, &p_disk), 0);
    const bytes record(p_disk, p_disk + rg_i_load_u32(p_disk));
    EXPECT_EQ(to_hex(record), to_hex(from_hex("5b 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00"
                                              "00 00 00 00 02 00 00 00 00 00 00 00 00 00 00 00"
                                              "03 00 00 00 03 00 00 00 00 00 00 00 00 00 00 00"
                                              "00 00 00 00 00 00 00 00 03 00 00 00 04 00 00 00"
                                              "02 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00"
                                              "00 00 00 00 69 64 00 76 61 6c 00")));
    std::free(p_disk);
}

TEST(the_metadata_record, in_the_form_of_the_file_has_offsets_for_names_and_definitions)
{
    definition  fields({{KT_INT32, "x"}});
    rg_column_t v = column("v", KT_INT64, RG_STANDARD, int64(0x1122334455667788));
    v.properties  = -5;
    lone_table table(
        {column("k", KT_CHAR_PTR, RG_PRIMARY_KEY, string("dflt")), sd_column("sd", KT_SD_PTR, fields.get()), v});
    kt_char_ptr_t p_disk = nullptr;
    ASSERT_EQ(rg_i_convert_metadata_memory_record_to_disk_record(table->p_metadata_record_data - 20, &p_disk), 0);
    const kt_uint32_t defaults = rg_i_default_data_length(table.get());
    const auto        word     = [&](kt_uint32_t column, kt_uint32_t offset) {
        return rg_i_load_u32(p_disk + 28 + 28 * column + offset);
    };
    EXPECT_EQ(rg_i_load_u32(p_disk + 24), 2u);
    EXPECT_EQ(word(0, 0), defaults) << "so a reader can tell where the defaults end";
    EXPECT_EQ(word(0, 16), 0u);
    EXPECT_EQ(word(0, 20), 0u);
    EXPECT_EQ(word(0, 24), 5u);
    EXPECT_EQ(word(1, 0), defaults + 2);
    EXPECT_EQ(word(1, 4), static_cast<kt_uint32_t>(KT_SD_PTR));
    EXPECT_EQ(word(1, 16), defaults + 5);
    EXPECT_EQ(word(2, 12), static_cast<kt_uint32_t>(-5));
    EXPECT_EQ(word(2, 20), 0x55667788u);
    EXPECT_EQ(word(2, 24), 0x11223344u);
    const kt_uint32_t region = 28 + 28 * 3;
    EXPECT_EQ(std::memcmp(p_disk + region, rg_i_default_data(table.get()), rg_i_load_u32(p_disk) - region), 0);
    std::free(p_disk);
}

TEST(the_metadata_record, in_the_form_of_the_file_needs_memory)
{
    lone_table    table({key_column()});
    kt_char_ptr_t p_disk = nullptr;
    fail_each_allocation([&] {
        return rg_i_convert_metadata_memory_record_to_disk_record(table->p_metadata_record_data - 20, &p_disk);
    });
    std::free(p_disk);
}

TEST(columns, turn_into_offsets_and_back_in_place)
{
    definition  fields({{KT_INT32, "x"}});
    lone_table  table({key_column(), sd_column("sd", KT_SD_PTR, fields.get())});
    const bytes before = metadata_of(*table.get());
    rg_i_convert_columns_pointers_to_offsets(table.get());
    const kt_uint64_t defaults = 8; // an empty structured data item
    EXPECT_EQ(reinterpret_cast<kt_uint64_t>(table->p_columns[0].name), defaults);
    EXPECT_EQ(reinterpret_cast<kt_uint64_t>(table->p_columns[0].sd_defn), 0u);
    EXPECT_EQ(reinterpret_cast<kt_uint64_t>(table->p_columns[1].name), defaults + 3);
    EXPECT_EQ(reinterpret_cast<kt_uint64_t>(table->p_columns[1].sd_defn), defaults + 6);
    rg_i_convert_columns_offsets_to_pointers(table.get());
    EXPECT_EQ(metadata_of(*table.get()), before);
}

// ---- The table object ----

TEST(a_new_table, has_no_rows_no_changes_and_one_reference)
{
    open_tree            tree;
    const rg_i_table_t & table = object(create_table(tree, "t", {key_column()}, RG_MODE_WRITE));
    EXPECT_STREQ(table.p_name, "t");
    EXPECT_EQ(table.references, 1u);
    EXPECT_EQ(table.total_applied_rows, 0u);
    EXPECT_EQ(table.total_committed_rows, 0u);
    EXPECT_EQ(table.maximum_rows, 100u);
    EXPECT_EQ(table.p_rows_change_list, nullptr);
    EXPECT_EQ(table.p_delete_rows_change_list, nullptr);
    EXPECT_EQ(table.ready_for_commit, 0u);
    EXPECT_EQ(table.change_counter, 1u);
    EXPECT_EQ(table.file_fd, -1);
    EXPECT_EQ(table.rewrite_file_fd, -1);
    EXPECT_EQ(table.p_file_path, nullptr);
    EXPECT_EQ(table.p_rows_hash_table, nullptr);
    ASSERT_NE(table.p_application_metadata, nullptr);
    EXPECT_EQ(table.p_application_metadata->max_elements, 1u);
    EXPECT_EQ(table.p_application_metadata->total_elements, 0u);
}

TEST(a_new_table, has_room_for_a_hundred_rows_of_a_guessed_size)
{
    lone_table table({key_column(), column("a", KT_INT32), column("b", KT_INT32)});
    // The metadata's block has 100 times its length, which holds the estimate of (3 + 3) * 8 * 100 bytes.
    EXPECT_EQ(table->record_buffer_pool.total_bytes, (16 + 120 + 3 + 2 + 2) * 100u + 32);

    std::vector<rg_column_t> columns = {key_column()};
    for (int i = 0; i < 40; ++i)
        columns.push_back(column("s" + std::to_string(i), KT_CHAR_PTR, RG_STANDARD, null_value()));
    lone_table        wide(columns);
    const kt_uint32_t estimate = ((41 + 3) * 8 + 40 * 100) * 100;
    EXPECT_EQ(wide->record_buffer_pool.p_last_record_buffer->total_bytes, estimate + 32)
        << "a block of its own, as large as the estimate of more than 64 KiB";
}

TEST(a_table_created_for_reading, is_open_for_writing_all_the_same)
{
    open_tree          tree;
    rg_opaque_handle_t handle = create_table(tree, "t", {key_column()}, RG_MODE_READ);
    EXPECT_EQ(object(handle).mode, static_cast<kt_uint32_t>(RG_MODE_WRITE));
    EXPECT_EQ(add_row(handle, {{"id", uint32(1)}}), 0);
}

TEST(a_table_keyed_by_resource_handle, is_hashed_without_asking)
{
    lone_table table({column("h", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY, null_value())});
    ASSERT_NE(table->p_rows_hash_table, nullptr);
    EXPECT_EQ(table->p_rows_hash_table->total_hash_buckets, 16384u);
    EXPECT_EQ(table->p_rows_hash_table->p_hash_function, nullptr);
}

TEST(the_environment_variable_for_visible_updates, affects_only_tables_created_while_it_is_set)
{
    open_tree          tree;
    rg_opaque_handle_t before = create_table(tree, "before", {key_column()}, RG_MODE_WRITE);
    rg_opaque_handle_t during = nullptr;
    {
        environment_variable set("RG_UNCOMMITTED_UPDATES_VISIBLE", "0");
        during = create_table(tree, "during", {key_column()}, RG_MODE_WRITE);
    }
    rg_opaque_handle_t after = create_table(tree, "after", {key_column()}, RG_MODE_WRITE);
    EXPECT_EQ(object(before).uncommitted_updates_visible, 0u);
    EXPECT_EQ(object(during).uncommitted_updates_visible, 1u) << "whatever its value";
    EXPECT_EQ(object(after).uncommitted_updates_visible, 0u);
}

TEST(the_environment_variable_for_visible_updates, works_when_it_is_empty)
{
    environment_variable set("RG_UNCOMMITTED_UPDATES_VISIBLE", "");
    lone_table           table({key_column()});
    EXPECT_EQ(table->uncommitted_updates_visible, 1u);
}

TEST(creating_a_table, closes_the_hash_table_on_every_failure)
{
    // That nothing leaks is what the leak checker of the sanitizers says about this.
    rg_column_t    no_key[] = {column("a", KT_INT32)};
    rg_column_t    good[]   = {key_column()};
    rg_i_table_t * p_table  = nullptr;
    const auto     hashed   = [] {
        rg_hash_table_t * p_hash_table = nullptr;
        EXPECT_EQ(rg_i_hash_table_open(16, hash_uint32, compare_uint32, &p_hash_table), 0);
        return p_hash_table;
    };
    EXPECT_EQ(rg_i_create_transient_table(nullptr, nullptr, no_key, 1, 0, hashed(), &p_table), RG_E_KEY_EXPECTED);
    EXPECT_EQ(rg_i_create_transient_table(nullptr, nullptr, no_key, 0, 0, hashed(), &p_table), RG_E_NO_COLUMNS);
    fail_each_allocation([&] {
        rg_hash_table_t * p_hash_table = nullptr;
        if (const kt_int32_t rc = rg_i_hash_table_open(16, hash_uint32, compare_uint32, &p_hash_table); rc != 0)
            return rc;
        return rg_i_create_transient_table(nullptr, text("t"), good, 1, 0, p_hash_table, &p_table);
    });
    rg_i_close_table(p_table);
}
