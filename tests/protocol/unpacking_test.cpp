// SPDX-License-Identifier: MIT
// unpacking: what tables of packed buffers are, how they are found in a buffer, and buffers that are refused.
#include <gtest/gtest.h>

#include <cstdlib>

#include "protocol/hostile_kit.h"
#include "protocol/rg_x_protocol.h"
#include "support/allocations.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

constexpr char reading_op[] = "kt_pmsg_build_conv_packed_client_value";

table_model small_table(const std::string & path = "small")
{
    return {path,
            {{"id", KT_UINT32, a_number(KT_UINT32, 1), RG_PRIMARY_KEY}, {"text", KT_CHAR_PTR, a_string("none")}},
            {{a_number(KT_UINT32, 11), a_string("one")}, {a_number(KT_UINT32, 22), a_string("two")}}};
}

octets local_buffer(const std::vector<packed_model> & forms)
{
    return buffer_of(forms, machine::here);
}

octets local_buffer(const table_model & table)
{
    return local_buffer({packed_form(table, machine::here)});
}

kt_int32_t unpack_hashed(octets & buffer, kt_uint32_t buckets, rg_hash_function_t * p_hash,
                         rg_hash_keys_compare_function_t * p_compare, rg_opaque_handle_t tree,
                         rg_opaque_handle_t * p_table)
{
    return rg_unpack_table_1(buffer.data(), buckets, p_hash, p_compare, tree, 0, p_table);
}

// A buffer that must be refused, with nothing left in the tree.
void expect_refused(const packed_model & form, kt_int32_t code)
{
    octets     buffer = local_buffer({form});
    open_tree  tree;
    kt_int32_t rc = 0;
    unpacked(buffer, tree, 0, &rc);
    EXPECT_EQ(rc, code);
    EXPECT_EQ(error_code(), code);
    EXPECT_EQ(static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree))->p_tables, nullptr);
}

void expect_damaged(const packed_model & form)
{
    expect_refused(form, RG_E_LIBRARY_CALL);
}

kt_uint32_t always_too_large(void *)
{
    return 1000;
}

} // namespace

// ---- The table ----

TEST(unpacking, a_table_of_every_type_comes_back)
{
    const table_model table = table_of_everything();
    octets            buffer;
    {
        open_tree   sender;
        table_maker maker;
        buffer = packed({{maker.create(sender, table)}});
    }
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    ASSERT_NE(handle, nullptr);
    expect_rows(handle, table);
    const rg_i_table_t & object = object_of(handle);
    ASSERT_EQ(object.total_columns, table.columns.size());
    for (size_t c = 0; c < table.columns.size(); ++c) {
        EXPECT_STREQ(object.p_columns[c].name, table.columns[c].name.c_str());
        EXPECT_EQ(object.p_columns[c].type, table.columns[c].type);
        EXPECT_EQ(object.p_columns[c].qualifier, table.columns[c].qualifier);
        EXPECT_EQ(object.p_columns[c].properties, table.columns[c].properties);
    }
}

TEST(unpacking, the_table_is_read_only_and_all_its_rows_are_committed)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    ASSERT_NE(handle, nullptr);
    const rg_i_table_t & object = object_of(handle);
    EXPECT_EQ(object.mode, static_cast<kt_uint32_t>(RG_MODE_READ));
    EXPECT_EQ(object.total_applied_rows, 2u);
    EXPECT_EQ(object.total_committed_rows, 2u);
    EXPECT_EQ(object.change_counter, 1u);
    EXPECT_EQ(object.references, 1u);
    EXPECT_EQ(object.p_rows_change_list, nullptr);
    for (kt_uint32_t row = 0; row < 2; ++row) {
        EXPECT_EQ(state_of(handle, row), static_cast<rg_row_state_t>(RG_ROW_STATE_COMMITTED));
        EXPECT_EQ(object.p_rows_packed_index[row], row);
        EXPECT_EQ(slot_of(handle, row).packed_index, row);
        EXPECT_EQ(slot_of(handle, row).p_applied,
                  reinterpret_cast<kt_char_ptr_t>(object.p_packed_rows_array->elements[row].ptr_binary) + 20);
    }
    EXPECT_EQ(find_key(handle, uint32(22)), 1);
    EXPECT_EQ(find_key(handle, uint32(33)), -RG_E_NO_SUCH_KEY);
}

TEST(unpacking, every_call_that_writes_is_refused)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    kt_value_t               value  = string("x");
    kt_binary_t              binary = {0, {0}};
    EXPECT_EQ(add_row(handle, {{"id", uint32(3)}}), RG_E_ACCESS);
    EXPECT_EQ(rg_set_field_by_key_1(handle, uint32(11), text("text"), &value), RG_E_ACCESS);
    EXPECT_EQ(rg_delete_row_by_index_1(handle, 0), RG_E_ACCESS);
    EXPECT_EQ(rg_set_application_metadata_1(handle, &binary), RG_E_ACCESS);
    EXPECT_EQ(rg_apply_1(handle, 0), RG_E_ACCESS);
    EXPECT_EQ(rg_commit_1(handle), RG_E_ACCESS);
    EXPECT_EQ(rg_abort_1(handle), RG_E_ACCESS);
    expect_rows(handle, small_table());
}

TEST(unpacking, opening_the_table_for_writing_is_refused_and_changes_nothing)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    kt_int32_t               rc     = 0;
    for (const kt_int32_t mode : {2, 3, 6, 7}) {
        open_table(tree, "small", mode, &rc);
        EXPECT_EQ(rc, RG_E_ACCESS);
        EXPECT_EQ(error_code(), RG_E_ACCESS);
    }
    EXPECT_EQ(object_of(handle).references, 1u);
    EXPECT_EQ(object_of(handle).mode, static_cast<kt_uint32_t>(RG_MODE_READ));
    EXPECT_EQ(object_of(handle).implicitly_controlled, 1u);

    EXPECT_EQ(open_table(tree, "small", RG_MODE_READ), handle);
    EXPECT_EQ(object_of(handle).references, 2u);
    EXPECT_EQ(rg_close_table_1(handle), 0);
    EXPECT_EQ(rg_close_table_1(handle), 0);
    open_table(tree, "small", RG_MODE_WRITE, &rc);
    EXPECT_EQ(rc, RG_E_ACCESS) << "nobody has it open, and it waits in the tree";
    EXPECT_EQ(open_table(tree, "small", RG_MODE_READ), handle);
    EXPECT_EQ(object_of(handle).references, 1u);
    expect_rows(handle, small_table());
}

TEST(unpacking, the_applications_binary_and_the_change_counter_do_not_travel)
{
    open_tree                sender;
    table_maker              maker;
    const rg_opaque_handle_t source = maker.create(sender, small_table());
    kt_binary_t              binary = {2, {1}};
    ASSERT_EQ(rg_set_application_metadata_1(source, &binary), 0);
    ASSERT_GT(object_of(source).change_counter, 1u);
    octets                   buffer = packed({{source}});
    open_tree                tree;
    const rg_opaque_handle_t handle   = unpacked(buffer, tree);
    kt_binary_t *            p_binary = nullptr;
    EXPECT_EQ(rg_get_application_metadata_1(handle, &p_binary), RG_E_NO_SUCH_KEY);
    EXPECT_EQ(object_of(handle).change_counter, 1u);
}

TEST(unpacking, a_table_without_rows)
{
    table_model table = small_table();
    table.rows.clear();
    octets                   buffer = local_buffer(table);
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    expect_rows(handle, table);
    EXPECT_EQ(read_packed(handle, 0, "id").rc, RG_E_NO_SUCH_INDEX);
}

TEST(unpacking, a_table_of_a_file_comes_under_its_registry_path)
{
    registry_of_tables       registry;
    table_maker              maker;
    const rg_opaque_handle_t source = maker.create(registry.tree, small_table("/kept/deep/table"));
    octets                   buffer = packed({{source}});
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    ASSERT_NE(handle, nullptr);
    EXPECT_STREQ(object_of(handle).p_name, "/kept/deep/table");
    EXPECT_EQ(object_of(handle).p_file_path, nullptr);
    expect_rows(handle, small_table());
}

TEST(unpacking, under_a_mount_point_it_is_refused_without_a_record)
{
    octets             buffer = local_buffer(small_table("/kept/table"));
    registry_of_tables registry;
    kt_int32_t         rc = 0;
    ku_set_no_error_1();
    unpacked(buffer, registry.tree, 0, &rc);
    EXPECT_EQ(rc, RG_E_INTERNAL);
    EXPECT_EQ(error_code(), 0);
    EXPECT_FALSE(file_exists(registry.directory.file("table")));
}

TEST(unpacking, a_name_that_is_taken_is_refused)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    kt_int32_t               rc    = 0;
    const rg_opaque_handle_t first = unpacked(buffer, tree);
    ASSERT_NE(first, nullptr);
    unpacked(buffer, tree, 0, &rc);
    EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
    EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(unpack_hashed(buffer, 1024, hash_uint32, compare_uint32, tree, &handle), RG_E_TABLE_EXISTS);
    ASSERT_EQ(rg_close_table_1(first), 0);
    ASSERT_EQ(rg_delete_table_1(tree, text("small")), 0);
    EXPECT_NE(unpacked(buffer, tree), nullptr) << "its name is free again";
}

TEST(unpacking, a_table_without_a_name_has_no_path_to_go_to)
{
    expect_refused(packed_form(small_table(""), machine::here), RG_E_INVALID_PATH);
}

TEST(unpacking, chosen_rows_make_a_table_of_as_many)
{
    table_model  table                     = small_table();
    packed_model form                      = packed_form(table, machine::here);
    form.fixed_metadata.elements[1].number = 500;
    octets    buffer                       = local_buffer({form});
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table);
}

TEST(unpacking, many_rows_keep_their_order)
{
    table_model table          = small_table();
    table.columns[0].qualifier = RG_PRIMARY_KEY_NOCHECK;
    for (std::uint32_t id = 0; id < 1000; ++id)
        table.rows.push_back({a_number(KT_UINT32, 1000 - id), a_string(std::to_string(id))});
    octets    buffer = local_buffer(table);
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table);
}

TEST(unpacking, an_unpacked_table_packs_into_the_same_buffer)
{
    const table_model        table  = small_table();
    octets                   buffer = local_buffer(table);
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    octets                   again  = packed({{handle}});
    EXPECT_EQ(to_hex(again), to_hex(buffer));
    EXPECT_EQ(to_hex(packed({{handle, 1}})), to_hex(buffer));
}

TEST(unpacking, links_and_file_offsets_of_the_sender_mean_nothing)
{
    const row_words words  = {0xDEADBEEFDEADBEEF, 0x77, 0x01020304, 0x0A0B0C0D, 0xCAFE0001};
    octets          buffer = local_buffer({packed_form(small_table(), machine::here, words)});
    open_tree       tree;
    expect_rows(unpacked(buffer, tree), small_table());
}

// ---- With other calls ----

TEST(unpacking_and_then, rows_are_selected_and_the_result_is_packed_without_a_name)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    rg_opaque_handle_t       result = nullptr;
    ASSERT_EQ(rg_select_1(handle, nullptr, 0, &result, text("id == 22")), 0) << error_text();
    octets again = packed({{result}});
    EXPECT_EQ(row_count(again), 1u);
    EXPECT_EQ(item_model(again, 0, item::name).text, "");
    EXPECT_EQ(item_model(again, 0, item::fixed_metadata).elements[0].text, "");
    EXPECT_EQ(rg_close_table_1(result), 0);
}

// A copy in memory maps the rows' addresses through the blocks of the pool, and these rows lie in none.
TEST(unpacking_and_then, a_copy_in_memory_keeps_the_count_and_no_rows)
{
    octets                   buffer = local_buffer(small_table());
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    ASSERT_EQ(rg_copy_table_by_handle_1(handle, text("copy"), 0), 0) << error_text();
    const rg_opaque_handle_t copy = open_table(tree, "copy", RG_MODE_READ);
    ASSERT_NE(copy, nullptr);
    EXPECT_EQ(object_of(copy).total_committed_rows, 2u);
    EXPECT_NE(read_packed(copy, 0, "id").rc, 0);
    EXPECT_EQ(row_count(packed({{copy}})), 0u) << "there is nothing to pack";
    expect_rows(handle, small_table());
}

TEST(unpacking_and_then, a_copy_to_a_file_has_all_rows_whatever_offsets_the_sender_had)
{
    const row_words          words  = {0, 2, 0x01020304, 0x0A0B0C0D, 0xCAFE0001};
    octets                   buffer = local_buffer({packed_form(small_table(), machine::here, words)});
    registry_of_tables       registry;
    const rg_opaque_handle_t handle = unpacked(buffer, registry.tree);
    ASSERT_EQ(rg_copy_table_by_handle_1(handle, text("/kept/copy"), 0), 0) << error_text();
    kt_int32_t               rc   = 0;
    const rg_opaque_handle_t copy = open_table(registry.tree, "/kept/copy", RG_MODE_WRITE, &rc);
    ASSERT_EQ(rc, 0) << error_text();
    expect_rows(copy, small_table());
    EXPECT_EQ(add_row(copy, {{"id", uint32(33)}}), 0) << error_text();
    EXPECT_EQ(rg_close_table_1(copy), 0);
}

// ---- Keys ----

TEST(unpacking_keys, with_buckets_the_key_is_hashed)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    ASSERT_EQ(unpack_hashed(buffer, 1024, hash_uint32, compare_uint32, tree, &handle), 0);
    ASSERT_NE(object_of(handle).p_rows_hash_table, nullptr);
    EXPECT_EQ(find_key(handle, uint32(22)), 1);
    EXPECT_EQ(taken_string(read_key(handle, uint32(11), "text")), "one");
    EXPECT_EQ(find_key(handle, uint32(33)), -RG_E_NO_SUCH_KEY);
}

TEST(unpacking_keys, strings_are_hashed_where_they_lie)
{
    table_model table{"t", {{"k", KT_CHAR_PTR, {}, RG_PRIMARY_KEY}, {"n", KT_INT32}}, {}};
    for (unsigned i = 0; i < 300; ++i)
        table.rows.push_back({a_string("key " + std::to_string(i)), a_number(KT_INT32, i)});
    octets             buffer = local_buffer(table);
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    ASSERT_EQ(unpack_hashed(buffer, 1024, hash_string, compare_string, tree, &handle), 0);
    for (unsigned i = 0; i < 300; ++i)
        EXPECT_EQ(find_key(handle, string("key " + std::to_string(i))), i);
    expect_rows(handle, table);
}

TEST(unpacking_keys, resource_handles_are_always_hashed)
{
    const table_model table{
        "t",
        {{"k", KT_RSRC_HANDLE_PTR, {}, RG_PRIMARY_KEY}, {"n", KT_INT32}},
        {{a_handle(1, 2, 3, 4, 5), a_number(KT_INT32, 1)}, {a_handle(1, 2, 3, 4, 16384 + 5), a_number(KT_INT32, 2)}}};
    octets    buffer = local_buffer(table);
    open_tree tree;
    for (const kt_uint32_t buckets : {0u, 7u}) {
        rg_opaque_handle_t handle = nullptr;
        open_tree          another;
        ASSERT_EQ(unpack_hashed(buffer, buckets, nullptr, nullptr, another, &handle), 0);
        ASSERT_NE(object_of(handle).p_rows_hash_table, nullptr);
        EXPECT_EQ(object_of(handle).p_rows_hash_table->total_hash_buckets, 16384u);
        kt_resource_handle_t key = {1, {2, 3, 4, 16384 + 5}};
        kt_value_t           value;
        value.ptr_rsrc_handle = &key;
        EXPECT_EQ(find_key(handle, value), 1);
    }
}

TEST(unpacking_keys, a_function_that_is_missing_is_told)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(unpack_hashed(buffer, 1024, nullptr, compare_uint32, tree, &handle), RG_E_NULL_POINTER);
    EXPECT_EQ(unpack_hashed(buffer, 1024, hash_uint32, nullptr, tree, &handle), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(unpack_hashed(buffer, 0, nullptr, nullptr, tree, &handle), 0);
}

TEST(unpacking_keys, a_bucket_that_is_none_is_an_inconsistency)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(unpack_hashed(buffer, 10, always_too_large, compare_uint32, tree, &handle), RG_E_INTERNAL);
    EXPECT_EQ(error_code(), RG_E_INTERNAL);
    EXPECT_NE(unpacked(buffer, tree), nullptr) << "nothing was left of the first";
}

TEST(unpacking_keys, two_rows_of_one_key_are_refused_unless_the_column_allows_them)
{
    table_model table = small_table();
    table.rows[1][0]  = table.rows[0][0];
    expect_refused(packed_form(table, machine::here), RG_E_DUPLICATE_KEY);
    octets             buffer = local_buffer(table);
    open_tree          tree;
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(unpack_hashed(buffer, 1024, hash_uint32, compare_uint32, tree, &handle), RG_E_DUPLICATE_KEY);

    table.columns[0].qualifier = RG_PRIMARY_KEY_NOCHECK;
    octets allowed             = local_buffer(table);
    expect_rows(unpacked(allowed, tree), table);
}

// ---- Columns ----

TEST(unpacking_columns, a_structured_datas_default_arrives_as_the_empty_value)
{
    octets      buffer;
    table_model table = table_of_everything();
    table.rows.clear();
    {
        open_tree   sender;
        table_maker maker;
        buffer = packed({{maker.create(sender, table)}});
    }
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    const rg_i_table_t &     object = object_of(handle);
    for (size_t c = 0; c < table.columns.size(); ++c) {
        SCOPED_TRACE(table.columns[c].name);
        const kt_data_type_t type = table.columns[c].type;
        kt_value_t           value;
        ASSERT_EQ(kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, type, &value, &object.p_columns[c].default_value,
                                                           rg_i_default_data(&object),
                                                           rg_i_default_data_length(&object)),
                  0);
        expect_same_value(is_structured(type) ? empty_value(type) : table.columns[c].default_value,
                          model_of(type, value));
        if (!is_number(type))
            std::free(value.ptr_char);
    }
}

TEST(unpacking_columns, a_definition_is_that_of_the_buffer)
{
    octets      buffer;
    table_model table = {"t",
                         {{"id", KT_UINT32, {}, RG_PRIMARY_KEY},
                          {"sd", KT_SD_PTR, {}, RG_STANDARD, 0, {{KT_INT32, "number"}, {KT_CHAR_PTR, "b"}}}},
                         {}};
    {
        open_tree   sender;
        table_maker maker;
        buffer = packed({{maker.create(sender, table)}});
    }
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    // In the record, behind the number of fields: type and name, one behind the other.
    octets expected = {'n', 'u', 'm', 'b', 'e', 'r', 0};
    append(expected, std::uint32_t{KT_CHAR_PTR}, machine::here);
    expected.insert(expected.end(), {'b', 0});
    const auto * p_definition = reinterpret_cast<const std::uint8_t *>(object_of(handle).p_columns[1].sd_defn);
    EXPECT_EQ(rg_i_load_u32(p_definition), 2u);
    EXPECT_EQ(octets(p_definition + 4, p_definition + 4 + expected.size()), expected);
}

TEST(unpacking_columns, bad_columns_are_refused_as_at_any_creation)
{
    const packed_model whole = packed_form(small_table(), machine::here);

    packed_model form = whole;
    form.column_metadata.elements.clear();
    form.rows.elements.clear();
    expect_refused(form, RG_E_NO_COLUMNS);

    form                                                = whole;
    form.column_metadata.elements[0].elements[2].number = RG_STANDARD;
    expect_refused(form, RG_E_KEY_EXPECTED);
    form                                                = whole;
    form.column_metadata.elements[1].elements[2].number = RG_PRIMARY_KEY;
    expect_refused(form, RG_E_DUPLICATE_KEY);
    form                                              = whole;
    form.column_metadata.elements[1].elements[0].text = "id";
    expect_refused(form, RG_E_DUPLICATE_COLUMN);
    form                                              = whole;
    form.column_metadata.elements[1].elements[0].text = "not a name";
    expect_refused(form, RG_E_INVALID_COLUMN);
    for (const std::uint32_t type : {0u, 1u, 23u, 0x7FFFFFFFu}) {
        form                                                = whole;
        form.column_metadata.elements[1].elements[1].number = type;
        form.column_metadata.elements[1].elements[4]        = a_number(KT_UINT64, 0);
        expect_refused(form, RG_E_INVALID_COLUMN);
    }
    form                                                = whole;
    form.column_metadata.elements[1].elements[1].number = KT_SD_PTR; // and no definition
    form.column_metadata.elements[1].elements[4]        = a_number(KT_UINT32, 0);
    expect_refused(form, RG_E_INVALID_COLUMN);
}

TEST(unpacking_columns, metadata_of_another_form_is_damage)
{
    const packed_model whole = packed_form(small_table(), machine::here);
    for (const size_t element : {0u, 1u, 2u, 3u, 5u}) {
        packed_model form                                  = whole;
        form.column_metadata.elements[1].elements[element] = numbers(KT_INT32_ARRAY, {1});
        expect_damaged(form);
    }
    for (size_t elements = 0; elements < 6; ++elements) {
        packed_model form = whole;
        form.column_metadata.elements[1].elements.resize(elements);
        expect_damaged(form);
    }
    packed_model form               = whole;
    form.fixed_metadata.elements[0] = a_number(KT_UINT64, 0x4141414141414141);
    expect_damaged(form);
    form.fixed_metadata.elements.clear();
    expect_damaged(form);
}

TEST(unpacking_columns, a_number_is_never_taken_for_a_pointer)
{
    const packed_model whole = packed_form(table_of_everything(), machine::here);
    for (size_t c = 0; c < whole.column_metadata.elements.size(); ++c) {
        packed_model form    = whole;
        model &      element = form.column_metadata.elements[c].elements[4];
        const bool   is_direct =
            is_number(static_cast<kt_data_type_t>(form.column_metadata.elements[c].elements[1].number));
        SCOPED_TRACE("c" + std::to_string(c));
        element = is_direct ? a_string("text") : a_number(KT_UINT64, 0x4141414141414141);
        expect_damaged(form);
        if (is_direct)
            continue;
        element = a_number(KT_UINT32, 0x41414141);
        expect_damaged(form);
    }
}

TEST(unpacking_columns, a_definition_that_is_short_of_fields_is_damage)
{
    const table_model  table                            = {"t",
                                                           {{"id", KT_UINT32, {}, RG_PRIMARY_KEY},
                                                            {"sd", KT_SD_PTR, {}, RG_STANDARD, 0, {{KT_INT32, "number"}, {KT_CHAR_PTR, "b"}}}},
                                                           {}};
    const packed_model whole                            = packed_form(table, machine::here);
    packed_model       form                             = whole;
    form.column_metadata.elements[1].elements[5].number = 3;
    expect_damaged(form);
    form.column_metadata.elements[1].elements[5].number = 0xFFFFFFFF;
    expect_damaged(form);
    form = whole;
    form.column_metadata.elements[1].elements.resize(7);
    expect_damaged(form);
    form                                         = whole;
    form.column_metadata.elements[1].elements[6] = numbers(KT_UINT64_ARRAY, {1, 2});
    expect_damaged(form);
    form                                         = whole;
    form.column_metadata.elements[1].elements[7] = numbers(KT_UINT64_ARRAY, {1, 2});
    expect_damaged(form);
    // The last column's failure releases the definitions of those ahead of it.
    form = whole;
    form.column_metadata.elements.push_back(form.column_metadata.elements[1]);
    form.column_metadata.elements[2].elements[5].number = 9;
    expect_damaged(form);
}

// ---- Rows ----

TEST(unpacking_rows, a_row_shorter_than_its_slots_is_damage)
{
    const packed_model whole = packed_form(small_table(), machine::here);
    for (const size_t length : {0, 3, 16, 19, 35}) {
        packed_model form = whole;
        form.rows.elements[1].text.resize(length);
        expect_damaged(form);
    }
    // Just the slots: the key is there, and no text.
    packed_model form = whole;
    form.rows.elements[1].text.resize(40);
    octets                   buffer = local_buffer({form});
    open_tree                tree;
    const rg_opaque_handle_t handle = unpacked(buffer, tree);
    ASSERT_NE(handle, nullptr);
    EXPECT_EQ(read_packed(handle, 1, "id").value.val_uint32, 22u);
    EXPECT_EQ(read_packed(handle, 1, "text").rc, RG_E_LIBRARY_CALL);
    expect_library_error(reading_op, 4);
}

TEST(unpacking_rows, rows_of_fewer_columns_than_are_told_are_damage)
{
    packed_model form = packed_form(small_table(), machine::here);
    form.column_metadata.elements.push_back(column_element({"more", KT_INT64}));
    form.column_metadata.elements.push_back(column_element({"evenmore", KT_INT64}));
    expect_damaged(form);
}

TEST(unpacking_rows, an_anchor_that_leaves_its_row_spoils_that_value_alone)
{
    struct {
        std::uint32_t offset, length;
    } const wild[] = {{0, 5}, {5, 1}, {0xFFFFFFFF, 1}, {0, 0xFFFFFFFF}, {1, 0xFFFFFFFF}, {3, 2}, {0, 0}};
    for (const auto & anchor : wild) {
        SCOPED_TRACE(anchor.offset);
        packed_model form = packed_form(small_table(), machine::here);
        octets       row(form.rows.elements[1].text.begin(), form.rows.elements[1].text.end());
        put(row, 20 + 8, anchor.offset, machine::here);
        put(row, 20 + 12, anchor.length, machine::here);
        form.rows.elements[1].text.assign(row.begin(), row.end());
        octets                   buffer = local_buffer({form});
        open_tree                tree;
        const rg_opaque_handle_t handle = unpacked(buffer, tree);
        ASSERT_NE(handle, nullptr);
        EXPECT_EQ(read_packed(handle, 1, "text").rc, RG_E_LIBRARY_CALL);
        expect_library_error(reading_op, 4);
        EXPECT_EQ(read_packed(handle, 1, "id").value.val_uint32, 22u);
        EXPECT_EQ(taken_string(read_packed(handle, 0, "text")), "one");
    }
}

TEST(unpacking_rows, a_key_that_leaves_its_row_is_damage)
{
    const table_model table{"t", {{"k", KT_CHAR_PTR, {}, RG_PRIMARY_KEY}}, {{a_string("one")}, {a_string("two")}}};
    for (const size_t half : {0u, 4u}) {
        packed_model form = packed_form(table, machine::here);
        form.rows.elements[1].text.replace(20 + half, 4, std::string(4, '\x11'));
        expect_damaged(form);
        octets             buffer = local_buffer({form});
        open_tree          tree;
        rg_opaque_handle_t handle = nullptr;
        EXPECT_EQ(unpack_hashed(buffer, 1024, hash_string, compare_string, tree, &handle), RG_E_LIBRARY_CALL);
        expect_library_error(reading_op, 4);
    }
}

// ---- Looking into a buffer ----

TEST(looking_into_a_buffer, tables_are_counted_and_named)
{
    octets buffer = local_buffer(
        {packed_form(small_table("first"), machine::here), packed_form(small_table("second"), machine::here)});
    kt_uint32_t total = 99;
    ASSERT_EQ(rg_get_total_packed_tables_1(buffer.data(), &total), 0);
    EXPECT_EQ(total, 2u);
    kt_char_ptr_t p_name = nullptr;
    ASSERT_EQ(rg_get_packed_table_name_1(buffer.data(), 0, &p_name), 0);
    EXPECT_STREQ(p_name, "first");
    EXPECT_EQ(reinterpret_cast<std::uint8_t *>(p_name), &buffer[40 + 64]) << "in the buffer, not a copy";
    ASSERT_EQ(rg_get_packed_table_name_1(buffer.data(), 1, &p_name), 0);
    EXPECT_STREQ(p_name, "second");

    octets none = local_buffer(std::vector<packed_model>{});
    ASSERT_EQ(rg_get_total_packed_tables_1(none.data(), &total), 0);
    EXPECT_EQ(total, 0u);
}

TEST(looking_into_a_buffer, the_name_of_a_table_of_a_file_is_its_files_path)
{
    registry_of_tables       registry;
    table_maker              maker;
    const rg_opaque_handle_t source = maker.create(registry.tree, small_table("/kept/table"));
    octets                   buffer = packed({{source}});
    kt_char_ptr_t            p_name = nullptr;
    ASSERT_EQ(rg_get_packed_table_name_1(buffer.data(), 0, &p_name), 0);
    EXPECT_EQ(p_name, registry.directory.path() + "/table");
}

TEST(looking_into_a_buffer, an_index_beyond_the_tables_is_refused)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    kt_char_ptr_t      p_name = nullptr;
    rg_opaque_handle_t table  = nullptr;
    for (const kt_uint32_t index : {1u, 2u, 0x07FFFFFFu, 0x7FFFFFFFu, 0xFFFFFFFEu}) {
        EXPECT_EQ(rg_get_packed_table_name_1(buffer.data(), index, &p_name), RG_E_NO_SUCH_INDEX);
        EXPECT_EQ(error_code(), RG_E_NO_SUCH_INDEX);
        EXPECT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, tree, index, &table), RG_E_NO_SUCH_INDEX);
    }
    octets none = local_buffer(std::vector<packed_model>{});
    EXPECT_EQ(rg_get_packed_table_name_1(none.data(), 0, &p_name), RG_E_NO_SUCH_INDEX);
    EXPECT_EQ(p_name, nullptr);
}

// The sum of the index test wraps to 0, and the slot's address wraps to the words ahead of the directory.
TEST(looking_into_a_buffer, the_largest_index_passes_the_test_and_leads_to_the_first_name)
{
    octets buffer =
        local_buffer({packed_form(small_table("a"), machine::here), packed_form(small_table("b"), machine::here)});
    kt_char_ptr_t p_name = nullptr;
    EXPECT_EQ(rg_get_packed_table_name_1(buffer.data(), 0xFFFFFFFF, &p_name), 0);
    EXPECT_STREQ(p_name, "a");
    open_tree          tree;
    rg_opaque_handle_t table = nullptr;
    EXPECT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, tree, 0xFFFFFFFF, &table), RG_E_LIBRARY_CALL);
    expect_library_error(reading_op, 4);

    octets none = local_buffer(std::vector<packed_model>{});
    EXPECT_EQ(rg_get_packed_table_name_1(none.data(), 0xFFFFFFFF, &p_name), RG_E_LIBRARY_CALL);
}

TEST(looking_into_a_buffer, missing_arguments_are_refused)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    kt_uint32_t        total  = 0;
    kt_char_ptr_t      p_name = nullptr;
    rg_opaque_handle_t table  = nullptr;
    EXPECT_EQ(rg_get_total_packed_tables_1(nullptr, &total), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_total_packed_tables_1(buffer.data(), nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_packed_table_name_1(nullptr, 0, &p_name), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_packed_table_name_1(buffer.data(), 0, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_unpack_table_1(nullptr, 0, nullptr, nullptr, tree, 0, &table), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, tree, 0, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, nullptr, 0, &table), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
    EXPECT_EQ(table, nullptr);
}

TEST(looking_into_a_buffer, a_length_below_the_fixed_part_is_damage)
{
    open_tree          tree;
    kt_uint32_t        total  = 99;
    kt_char_ptr_t      p_name = nullptr;
    rg_opaque_handle_t table  = nullptr;
    for (std::uint32_t length = 0; length < 72; ++length) {
        octets buffer = local_buffer(small_table());
        buffer.resize(std::max(length, 8u));
        put(buffer, 0, length, machine::here);
        exact_block block(buffer);
        EXPECT_EQ(rg_get_total_packed_tables_1(block.data(), &total), RG_E_LIBRARY_CALL) << length;
        expect_library_error(reading_op, 4);
        EXPECT_EQ(rg_get_packed_table_name_1(block.data(), 0, &p_name), RG_E_LIBRARY_CALL);
        EXPECT_EQ(rg_unpack_table_1(block.data(), 0, nullptr, nullptr, tree, 0, &table), RG_E_LIBRARY_CALL);
    }
    EXPECT_EQ(total, 99u);
}

TEST(looking_into_a_buffer, a_name_that_leaves_the_buffer_is_damage)
{
    kt_char_ptr_t p_name = nullptr;
    for (const size_t half : {0u, 4u}) {
        octets buffer = local_buffer(small_table());
        put(buffer, 40 + half, 0xFFFFFFF0u, machine::here);
        EXPECT_EQ(rg_get_packed_table_name_1(buffer.data(), 0, &p_name), RG_E_LIBRARY_CALL);
        expect_library_error(reading_op, 4);
    }
    // A last string without its end.
    octets buffer(72 + 4, 'x');
    std::fill_n(buffer.begin(), 72, std::uint8_t{0});
    put(buffer, 0, std::uint32_t{76}, machine::here);
    put(buffer, 32, std::uint32_t{1}, machine::here);
    put(buffer, 44, std::uint32_t{4}, machine::here);
    exact_block block(buffer);
    EXPECT_EQ(rg_get_packed_table_name_1(block.data(), 0, &p_name), RG_E_LIBRARY_CALL);
    EXPECT_EQ(p_name, nullptr);
}

// ---- Faults, hostile buffers, trace ----

TEST(unpacking_badly, anchors_that_leave_the_buffer_are_damage)
{
    for (size_t slot = 48; slot < 72; slot += 4) {
        octets buffer = local_buffer(small_table());
        put(buffer, slot, 0xFFFFFFF0u, machine::here);
        open_tree  tree;
        kt_int32_t rc = 0;
        unpacked(buffer, tree, 0, &rc);
        EXPECT_EQ(rc, RG_E_LIBRARY_CALL) << slot;
        expect_library_error(reading_op, 4);
    }
}

TEST(unpacking_badly, each_allocation_that_fails_leaves_nothing)
{
    octets buffer = local_buffer({packed_form(table_of_everything(), machine::here)});
    for (const bool hashed : {false, true}) {
        open_tree          tree;
        rg_opaque_handle_t handle = nullptr;
        unsigned           nth    = 1;
        for (;; ++nth) {
            fault_scope faults;
            ku_set_no_error_1();
            fail_call(call::allocation, nth, ENOMEM);
            const kt_int32_t rc =
                hashed ? unpack_hashed(
                             buffer, 64, [](void *) -> kt_uint32_t { return 5; }, compare_uint32, tree, &handle)
                       : unpack_hashed(buffer, 0, nullptr, nullptr, tree, &handle);
            const bool failed = failed_as_asked(call::allocation);
            reset_calls();
            if (!failed) {
                EXPECT_EQ(rc, 0) << error_text();
                break;
            }
            // The value library's calls tell it in their own way.
            EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL) << rc;
            EXPECT_EQ(error_code(), rc);
            if (rc == RG_E_LIBRARY_CALL)
                expect_library_error(reading_op, 3);
            EXPECT_EQ(handle, nullptr);
        }
        EXPECT_GT(nth, 10u);
        expect_rows(handle, table_of_everything());
    }
}

TEST(unpacking_badly, every_byte_changed_is_survived)
{
    const octets original = local_buffer({packed_form(small_table("a"), machine::here),
                                          packed_form({"b",
                                                       {{"k", KT_CHAR_PTR, {}, RG_PRIMARY_KEY},
                                                        {"sd", KT_SD_PTR, {}, RG_STANDARD, 0, {{KT_INT32, "numb"}}}},
                                                       {{a_string("x"), structured({a_string("y")})}}},
                                                      machine::here)});
    change_each_byte(original, [](octets & buffer) { use_hostile_buffer(buffer); });
}

TEST(unpacking_badly, every_length_is_survived)
{
    const octets original = local_buffer(small_table());
    for (size_t length = 0; length <= original.size(); ++length) {
        octets buffer = original;
        buffer.resize(std::max<size_t>(length, 8));
        put(buffer, 0, static_cast<std::uint32_t>(length), machine::here);
        use_hostile_buffer(buffer);
    }
}

TEST(unpacking, each_call_makes_its_two_events)
{
    octets             buffer = local_buffer(small_table());
    open_tree          tree;
    trace_catcher      catcher(1, 0);
    kt_uint32_t        total  = 0;
    kt_char_ptr_t      p_name = nullptr;
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, tree, 0, &handle), 0);
    EXPECT_EQ(rg_get_total_packed_tables_1(buffer.data(), &total), 0);
    EXPECT_EQ(rg_get_packed_table_name_1(buffer.data(), 5, &p_name), RG_E_NO_SUCH_INDEX);
    ASSERT_EQ(catcher.events().size(), 6u);
    for (std::uint32_t i = 0; i < 6; ++i)
        EXPECT_EQ(catcher.events()[i].id, 111 + i);
    EXPECT_EQ(catcher.events()[5].values, (std::vector<std::uint32_t>{RG_E_NO_SUCH_INDEX}));
}
