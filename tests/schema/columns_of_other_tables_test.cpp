// SPDX-License-Identifier: MIT
// Column changes of tables that came about in other ways: copies, selections, tables from packed buffers, tables of
// every type, damaged ones, and clients of another code set.
#include "protocol/packed_kit.h"
#include "schema/columns_kit.h"
#include "storage/table_files.h"

namespace kt_test
{

namespace
{

struct column_changes : testing::Test, registry_of_tables {
    rg_opaque_handle_t filled(table_kind kind = {true, false}, const std::string & name = "table")
    {
        const rg_opaque_handle_t table = make(kind, three_columns(), explicit_writing, name);
        add_rows(table, three_rows());
        EXPECT_EQ(commit(table), 0);
        return table;
    }
    rg_opaque_handle_t copied(rg_opaque_handle_t table, const std::string & path)
    {
        EXPECT_EQ(rg_copy_table_by_handle_1(table, text(path), 0), 0) << error_text();
        return open_table(tree, path, explicit_writing);
    }
};

} // namespace

// ---- Copies ----

TEST_F(column_changes, of_a_copy_in_memory_work_when_its_source_is_gone)
{
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        const rg_opaque_handle_t source = filled();
        const rg_opaque_handle_t first  = copied(source, "/first");
        EXPECT_EQ(rg_close_table_1(source), 0);
        EXPECT_EQ(rg_delete_table_1(tree, text("/scratch/table")), 0);
        const rg_opaque_handle_t second = copied(first, "/second");
        ASSERT_EQ(change.make(first), 0) << error_text();
        ASSERT_EQ(change.make(second), 0) << error_text();
        EXPECT_EQ(column_names_of(first), column_names_of(second));
        for (const rg_opaque_handle_t table : {first, second}) {
            for (const auto & [id, values] : three_rows())
                EXPECT_EQ(taken_string(read_key(table, uint32(id), "name", 1)), values.first);
            EXPECT_EQ(overlay_default(table, "name", string("nona")), 0);
            EXPECT_EQ(default_string_of(table, "name"), "nona");
            EXPECT_EQ(rg_close_table_1(table), 0);
        }
        EXPECT_EQ(rg_delete_table_1(tree, text("/first")), 0);
        EXPECT_EQ(rg_delete_table_1(tree, text("/second")), 0);
    }
}

TEST_F(column_changes, of_a_source_leave_its_copy_as_it_is)
{
    for (const table_kind kind : {table_kind{false, false}, table_kind{true, true}}) {
        const rg_opaque_handle_t source = filled(kind);
        const rg_opaque_handle_t copy   = copied(source, kind.persistent ? "/of_a_file" : "/of_memory");
        ASSERT_EQ(rename_column(source, "name", "title"), 0);
        EXPECT_EQ(rows_in(copy), three_rows());
        EXPECT_EQ(column_names_of(copy), (std::vector<std::string>{"id", "name", "val"}));
        ASSERT_EQ(delete_columns(copy, {"val"}), 0);
        EXPECT_EQ(rows_in(source, kind.persistent ? 0 : 1, "title"), three_rows());
    }
}

TEST_F(column_changes, of_a_file_that_was_read_into_memory_work)
{
    ASSERT_EQ(rg_close_table_1(filled({false, true})), 0);
    ASSERT_EQ(rg_copy_table_by_name_1(tree, text("/kept/table"), text("/memory"), 0), 0);
    const rg_opaque_handle_t table = open_table(tree, "/memory", RG_MODE_WRITE);
    ASSERT_EQ(delete_columns(table, {"val"}), 0) << error_text();
    ASSERT_EQ(add_columns(table, {column("extra", KT_CHAR_PTR, RG_STANDARD, string("e"))}), 0);
    for (const auto & [id, values] : three_rows()) {
        EXPECT_EQ(taken_string(read_key(table, uint32(id), "name", 1)), values.first);
        EXPECT_EQ(taken_string(read_key(table, uint32(id), "extra", 1)), "e");
    }
}

TEST_F(column_changes, of_a_table_that_was_copied_to_a_file_come_back_from_it)
{
    const rg_opaque_handle_t source = filled();
    ASSERT_EQ(add_columns(source, {column("extra", KT_CHAR_PTR, RG_STANDARD, string("e"))}), 0);
    on_each_table_of_three_rows::make_committed(source);
    const rg_opaque_handle_t copy = copied(source, "/kept/copy");
    EXPECT_EQ(rows_in(copy), three_rows());
    ASSERT_EQ(delete_columns(copy, {"name"}), 0);
    EXPECT_EQ(column_names_of(copy), (std::vector<std::string>{"id", "val", "extra"}));
}

TEST_F(column_changes, of_a_copy_of_packed_rows_are_refused_but_for_deletions_since_it_has_no_rows)
{
    octets buffer;
    {
        const rg_opaque_handle_t source = filled();
        buffer                          = packed({{source}});
    }
    open_tree          other_tree;
    rg_opaque_handle_t received = nullptr;
    ASSERT_EQ(rg_unpack_table_1(buffer.data(), 0, nullptr, nullptr, other_tree, 0, &received), 0);
    ASSERT_EQ(rg_copy_table_by_handle_1(received, text("/copy"), 0), 0);
    const rg_opaque_handle_t copy = open_table(other_tree, "/copy", explicit_writing);
    ASSERT_NE(copy, nullptr) << error_text();
    object_of(copy).mode = RG_MODE_WRITE;
    expect_failure_without_record(RG_E_ROW_DELETED, add_columns(copy, {column("extra", KT_INT32)}));
    EXPECT_EQ(delete_columns(copy, {"val"}), 0);
    EXPECT_EQ(object_of(copy).total_applied_rows, 0u);
    EXPECT_EQ(object_of(received).total_columns, 3u);
}

// ---- Selections ----

TEST_F(column_changes, of_a_selection_work)
{
    const rg_opaque_handle_t source = filled();
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        rg_opaque_handle_t selection = nullptr;
        ASSERT_EQ(rg_select_1(source, nullptr, 0, &selection, text("id > 1")), 0);
        ASSERT_EQ(change.make(selection), 0) << error_text();
        EXPECT_EQ(object_of(selection).mode, 6u);
        EXPECT_EQ(taken_string(read_key(selection, uint32(3), "name", 1)), "");
        EXPECT_EQ(read_key(selection, uint32(1), "name", 1).rc, RG_E_NO_SUCH_KEY);
        EXPECT_EQ(rg_close_table_1(selection), 0);
    }
}

// ---- Packed tables ----

TEST_F(column_changes, of_a_table_from_a_packed_buffer_are_refused_and_overlays_are_not)
{
    octets             buffer = packed({{filled()}});
    open_tree          other_tree;
    rg_opaque_handle_t table = nullptr;
    ASSERT_EQ(rg_unpack_table_1(buffer.data(), 16, hash_uint32, compare_uint32, other_tree, 0, &table), RG_E_INTERNAL)
        << "buckets are 1024";
    ASSERT_EQ(rg_unpack_table_1(buffer.data(), 1024, hash_uint32, compare_uint32, other_tree, 0, &table), 0);
    for (const column_change & change : all_changes())
        expect_failure(RG_E_ACCESS, change.make(table));
    EXPECT_EQ(rows_in(table), three_rows());

    ASSERT_EQ(overlay_default(table, "name", string("new")), 0);
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_PROTECTED), 0);
    EXPECT_EQ(rows_in(table), three_rows());
    octets             again = packed({{table}});
    open_tree          third_tree;
    rg_opaque_handle_t received = nullptr;
    ASSERT_EQ(rg_unpack_table_1(again.data(), 0, nullptr, nullptr, third_tree, 0, &received), 0);
    EXPECT_EQ(default_string_of(received, "name"), "new");
    EXPECT_EQ(column_of(received, "val").qualifier, rg_qualifier_t{RG_STANDARD | RG_PROTECTED});
    EXPECT_EQ(rows_in(received), three_rows());
}

// ---- Every type ----

TEST_F(column_changes, carry_values_and_defaults_of_every_type)
{
    table_model        table = table_of_everything("/kept/everything");
    table_maker        maker;
    rg_opaque_handle_t handle = maker.create(tree, table);
    ASSERT_EQ(rename_column(handle, "c8", "renamed"), 0) << error_text();
    ASSERT_EQ(add_columns(handle, {column("extra", KT_INT32, RG_STANDARD, int32(4))}), 0) << error_text();
    for (column_model & c : table.columns)
        if (c.name == "c8")
            c.name = "renamed";
    expect_rows(handle, table);
    ASSERT_EQ(rg_close_table_1(handle), 0);
    handle = open_table(tree, "/kept/everything", RG_MODE_WRITE);
    ASSERT_NE(handle, nullptr);
    expect_rows(handle, table);
    // A row of defaults.
    ASSERT_EQ(add_row(handle, {{"id", uint32(9)}}), 0);
    for (size_t c = 1; c < table.columns.size(); ++c)
        expect_same_value(table.columns[c].default_value,
                          read_model(handle, 2, table.columns[c].name, table.columns[c].type));
    // Half of the columns go.
    std::vector<std::string> gone;
    table_model              rest = table;
    rest.columns.clear();
    rest.rows.assign(2, {});
    for (size_t c = 0; c < table.columns.size(); ++c)
        if (c % 2 != 0) {
            gone.push_back(table.columns[c].name);
        } else {
            rest.columns.push_back(table.columns[c]);
            for (size_t row = 0; row < 2; ++row)
                rest.rows[row].push_back(table.rows[row][c]);
        }
    ASSERT_EQ(rg_close_table_1(handle), 0);
    handle = open_table(tree, "/kept/everything", RG_MODE_WRITE);
    ASSERT_EQ(delete_columns(handle, gone), 0) << error_text();
    ASSERT_EQ(rg_close_table_1(handle), 0);
    handle = open_table(tree, "/kept/everything", RG_MODE_WRITE);
    ASSERT_EQ(object_of(handle).total_columns, rest.columns.size() + 1);
    for (kt_uint32_t row = 0; row < 2; ++row)
        for (size_t c = 0; c < rest.columns.size(); ++c)
            expect_same_value(rest.rows[row][c], read_model(handle, row, rest.columns[c].name, rest.columns[c].type));
}

TEST_F(column_changes, of_a_table_keyed_by_resource_handle_keep_its_hash_table)
{
    const rg_opaque_handle_t table =
        make({false, false}, {column("h", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY), column("val", KT_INT64)});
    kt_resource_handle_t handle{7, {1, 2, 3, 4}};
    kt_value_t           key = null_value();
    key.ptr_rsrc_handle      = &handle;
    ASSERT_EQ(add_row(table, {{"h", key}, {"val", int64(5)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0) << error_text();
    ASSERT_NE(object_of(table).p_rows_hash_table, nullptr);
    EXPECT_EQ(read_key(table, key, "val", 1).value.val_int64, 5);
}

// ---- Damage ----

// No creation makes such a table, but a file may say anything.
TEST_F(column_changes, of_a_table_whose_key_is_not_in_front_carry_each_value_under_its_own_name)
{
    const rg_opaque_handle_t table          = filled({false, false});
    object_of(table).p_columns[0].qualifier = RG_STANDARD;
    object_of(table).p_columns[2].qualifier = RG_PRIMARY_KEY;
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0) << error_text();
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"val", "name", "id", "extra"}));
    EXPECT_EQ(rows_in(table, 1), three_rows());
}

TEST_F(column_changes, of_a_table_with_two_columns_of_one_name_stay_inside_their_lists)
{
    const rg_opaque_handle_t table =
        make({false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY), column("aa", KT_INT64), column("bb", KT_INT64),
                              column("cc", KT_INT64)});
    object_of(table).p_columns[2].name[0] = 'a';
    object_of(table).p_columns[2].name[1] = 'a';
    expect_failure_without_record(RG_E_DUPLICATE_COLUMN, add_columns(table, {column("extra", KT_INT32)}));
    ASSERT_EQ(delete_columns(table, {"aa"}), 0);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "cc"}));
}

TEST_F(column_changes, of_a_row_whose_value_leaves_its_record_are_refused)
{
    const rg_opaque_handle_t table = filled({false, false});
    kt_pmsg_value_anchor_t   anchor;
    kt_char_ptr_t            p_slot = rg_i_row_slot(slot_of(table, 1).p_applied, 1);
    std::memcpy(&anchor, p_slot, sizeof anchor);
    anchor.length += 1000;
    std::memcpy(p_slot, &anchor, sizeof anchor);
    const table_picture before = picture_of(table);
    expect_failure_without_record(RG_E_LIBRARY_CALL, add_columns(table, {column("extra", KT_INT32)}));
    expect_failure(RG_E_TABLE_UNREADABLE, delete_columns(table, {"val"}));
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(delete_columns(table, {"name"}), 0) << "with the damaged column itself";
}

// ---- Code sets ----

TEST_F(column_changes, go_through_the_clients_code_set)
{
    const rg_opaque_handle_t table = make({false, false}, three_columns());
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"name", string("\xc3\xa4")}}), 0);
    ASSERT_EQ(commit(table), 0);
    auto & object = *static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(tree));
    ASSERT_EQ(ku_iconv_close_1(object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_close_1(object.p_from_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_TO_TABLE, &object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_FROM_TABLE, &object.p_from_table_string_conversion_handle), 0);

    ASSERT_EQ(add_columns(table, {column("note", KT_CHAR_PTR, RG_STANDARD, string("\xf6"))}), 0);
    EXPECT_EQ(taken_string(read_key(table, uint32(1), "name", 1)), "\xe4");
    EXPECT_EQ(taken_string(read_key(table, uint32(1), "note", 1)), "\xf6");
    ASSERT_EQ(overlay_default(table, "note", string("\xfc")), 0);
    EXPECT_EQ(default_string_of(table, "note"), "\xfc");

    // A string that the client's code set lacks can't be carried.
    open_tree                other_tree;
    const rg_opaque_handle_t other = create_table(other_tree, "/t", three_columns(), explicit_writing);
    ASSERT_EQ(add_row(other, {{"id", uint32(1)}, {"name", string("\xe2\x82\xac")}}), 0);
    ASSERT_EQ(commit(other), 0);
    object_of(other).p_tree = &object;
    expect_failure_without_record(RG_E_LIBRARY_CALL, add_columns(other, {}));
    object_of(other).p_tree = static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(other_tree));
    EXPECT_EQ(taken_string(read_key(other, uint32(1), "name")), "\xe2\x82\xac");
}

} // namespace kt_test
