// SPDX-License-Identifier: MIT
// Adding, deleting and renaming columns and giving them other defaults: what the rows and the table are afterwards, and
// what is refused.
#include "schema/columns_kit.h"
#include "support/trace.h"

namespace kt_test
{

// ---- What becomes of rows ----

struct adding_columns : on_each_table_of_three_rows {
};
struct deleting_columns : on_each_table_of_three_rows {
};
struct renaming_a_column : on_each_table_of_three_rows {
};
struct changing_a_default : on_each_table_of_three_rows {
};
struct changing_columns : on_each_table_of_three_rows {
};
ON_EACH_KIND_OF_TABLE(adding_columns);
ON_EACH_KIND_OF_TABLE(deleting_columns);
ON_EACH_KIND_OF_TABLE(renaming_a_column);
ON_EACH_KIND_OF_TABLE(changing_a_default);
ON_EACH_KIND_OF_TABLE(changing_columns);

TEST_P(adding_columns, keeps_the_rows_and_gives_them_the_defaults_of_the_new_columns)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("count", KT_UINT64, RG_STANDARD, uint64(99)),
                                  column("note", KT_CHAR_PTR, RG_STANDARD, string("a note"))}),
              0)
        << error_text();
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val", "count", "note"}));
    EXPECT_EQ(rows_in(table, visible()), three_rows());
    for (kt_uint32_t id = 1; id <= 3; ++id) {
        EXPECT_EQ(read_key(table, uint32(id), "count", visible()).value.val_uint64, 99u);
        EXPECT_EQ(taken_string(read_key(table, uint32(id), "note", visible())), "a note");
    }
    EXPECT_EQ(default_string_of(table, "name"), "none");
    EXPECT_EQ(default_string_of(table, "note"), "a note");
}

TEST_P(adding_columns, leaves_the_callers_array_as_it_is)
{
    const rg_opaque_handle_t table   = filled();
    rg_column_t              columns = column("note", KT_CHAR_PTR, RG_STANDARD, string("a note"));
    ASSERT_EQ(rg_add_columns_1(table, &columns, 1), 0);
    EXPECT_STREQ(columns.default_value.ptr_char, "a note");
}

TEST_P(adding_columns, none_of_them_rebuilds_and_rewrites_the_table_and_counts_as_a_change)
{
    const rg_opaque_handle_t table   = filled();
    const kt_uint64_t        counter = object_of(table).change_counter;
    const ino_t              file_id = persistent() ? file_identity(file()) : 0;
    ASSERT_EQ(rg_add_columns_1(table, nullptr, 0), 0);
    EXPECT_EQ(object_of(table).change_counter, counter + 1);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val"}));
    EXPECT_EQ(rows_in(table, visible()), three_rows());
    if (persistent()) {
        EXPECT_NE(file_identity(file()), file_id) << "another file has the name";
    }
}

TEST_P(adding_columns, a_new_column_with_a_key_qualifier_is_refused_as_a_second_key)
{
    const rg_opaque_handle_t table  = filled();
    const table_picture      before = picture_of(table);
    for (const rg_qualifier_t qualifier : {RG_PRIMARY_KEY, RG_PRIMARY_KEY_NOCHECK})
        expect_failure_without_record(RG_E_DUPLICATE_KEY, add_columns(table, {column("k", KT_UINT32, qualifier)}));
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(adding_columns, is_refused_by_the_rules_of_a_creation_with_the_error_record_cleared)
{
    const rg_opaque_handle_t table  = filled();
    const table_picture      before = picture_of(table);
    expect_failure_without_record(RG_E_DUPLICATE_COLUMN, add_columns(table, {column("val", KT_INT32)}));
    expect_failure_without_record(RG_E_DUPLICATE_COLUMN,
                                  add_columns(table, {column("twice", KT_INT32), column("twice", KT_INT32)}));
    expect_failure_without_record(RG_E_INVALID_COLUMN, add_columns(table, {column("1st", KT_INT32)}));
    expect_failure_without_record(RG_E_INVALID_COLUMN, add_columns(table, {column("sd", KT_SD_PTR)}));
    expect_failure_without_record(RG_E_INVALID_COLUMN, add_columns(table, {column("none", KT_NONE)}));
    expect_failure(RG_E_NULL_POINTER, rg_add_columns_1(table, nullptr, 1));
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val"}));
}

TEST_P(adding_columns, sees_invisible_columns_and_keeps_them)
{
    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE, int32(5)));
    const rg_opaque_handle_t table = make(columns);
    add_rows(table, three_rows());
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val", "secret", "extra"}));
    EXPECT_EQ(read_key(table, uint32(2), "secret", visible()).value.val_int32, 5);
    EXPECT_EQ(column_of(table, "secret").qualifier, rg_qualifier_t{RG_STANDARD | RG_INVISIBLE});
}

TEST_P(deleting_columns, keeps_the_other_columns_with_their_values_definitions_and_order)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("last", KT_CHAR_PTR, RG_STANDARD, string("end"))}), 0);
    if (!persistent())
        make_committed(table);
    ASSERT_EQ(delete_columns(table, {"name"}), 0) << error_text();
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "val", "last"}));
    for (kt_uint32_t id = 1; id <= 3; ++id) {
        EXPECT_EQ(read_key(table, uint32(id), "val").value.val_int64, 10 * id);
        EXPECT_EQ(taken_string(read_key(table, uint32(id), "last")), "end");
        EXPECT_EQ(read_key(table, uint32(id), "name").rc, RG_E_INVALID_COLUMN);
    }
    EXPECT_EQ(default_string_of(table, "last"), "end");
    EXPECT_EQ(column_of(table, "val").default_value.val_int64, -1);
}

TEST_P(deleting_columns, all_but_the_key_leaves_a_table_of_one_column)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(delete_columns(table, {"val", "name"}), 0);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id"}));
    EXPECT_EQ(object_of(table).total_committed_rows, 3u);
    for (kt_uint32_t id = 1; id <= 3; ++id)
        EXPECT_EQ(read_key(table, uint32(id), "id").value.val_uint32, id);
}

TEST_P(deleting_columns, leaves_the_rows_committed_also_in_memory)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(delete_columns(table, {"val"}), 0);
    EXPECT_EQ(object_of(table).total_committed_rows, 3u);
    for (kt_uint32_t slot = 0; slot < 3; ++slot)
        EXPECT_EQ(state_of(table, slot), rg_row_state_t{RG_ROW_STATE_COMMITTED});
}

TEST_P(deleting_columns, refuses_the_key_a_hidden_column_an_unknown_one_and_one_given_twice)
{
    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE));
    const rg_opaque_handle_t table  = make(columns);
    const table_picture      before = picture_of(table);
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"id"}));
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"secret"}));
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"nothing"}));
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"val", "nothing"}));
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"val", "val"}));
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"val", "name", "id", "secret"}));
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(delete_columns(table, {"val"}), 0) << "beside a hidden column";
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "secret"}));
}

TEST_P(deleting_columns, looks_at_its_arguments_ahead_of_the_table_and_at_their_number_behind_it)
{
    const rg_opaque_handle_t table = filled();
    kt_char_ptr_t            names[5]{text("val"), nullptr, text("val"), text("val"), text("val")};
    object_of(table).mode = RG_MODE_READ;
    expect_failure(RG_E_NULL_POINTER, rg_delete_columns_1(table, nullptr, 0));
    expect_failure(RG_E_NO_COLUMNS, rg_delete_columns_1(table, names, 0));
    expect_failure(RG_E_ACCESS, rg_delete_columns_1(table, names, 5));
    object_of(table).mode = RG_MODE_WRITE;
    ASSERT_EQ(set_fields_by_key(table, uint32(1), {{"val", int64(11)}}), 0);
    expect_failure(RG_E_UNCOMMITTED_TABLE, rg_delete_columns_1(table, names, 5));
    ASSERT_EQ(rg_abort_1(table), 0);
    expect_failure(RG_E_INVALID_COLUMN, rg_delete_columns_1(table, names, 5));
    expect_failure(RG_E_INVALID_COLUMN, rg_delete_columns_1(table, names, 3));
    expect_failure(RG_E_NULL_POINTER, rg_delete_columns_1(table, names, 2));
}

TEST_P(renaming_a_column, leaves_the_rows_unchanged_under_the_new_name)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(rename_column(table, "name", "title"), 0) << error_text();
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "title", "val"}));
    EXPECT_EQ(rows_in(table, visible(), "title"), three_rows());
    EXPECT_EQ(read_key(table, uint32(1), "name", visible()).rc, RG_E_INVALID_COLUMN);
    EXPECT_EQ(default_string_of(table, "title"), "none");
}

TEST_P(renaming_a_column, takes_the_key_too)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(rename_column(table, "id", "number"), 0) << error_text();
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"number", "name", "val"}));
    EXPECT_EQ(read_key(table, uint32(2), "val", visible()).value.val_int64, 20);
}

TEST_P(renaming_a_column, to_the_name_of_another_column_is_refused)
{
    const rg_opaque_handle_t table  = filled();
    const table_picture      before = picture_of(table);
    expect_failure_without_record(RG_E_DUPLICATE_COLUMN, rename_column(table, "val", "name"));
    expect_failure_without_record(RG_E_DUPLICATE_COLUMN, rename_column(table, "id", "name"));
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(renaming_a_column, to_its_own_name_rewrites_the_table)
{
    const rg_opaque_handle_t table   = filled();
    const kt_uint64_t        counter = object_of(table).change_counter;
    const ino_t              file_id = persistent() ? file_identity(file()) : 0;
    ASSERT_EQ(rename_column(table, "val", "val"), 0);
    EXPECT_EQ(object_of(table).change_counter, counter + 1);
    EXPECT_EQ(rows_in(table, visible()), three_rows());
    if (persistent()) {
        EXPECT_NE(file_identity(file()), file_id);
    }
}

TEST_P(renaming_a_column, refuses_an_unknown_column_and_a_name_that_none_can_have_with_the_record_cleared)
{
    const rg_opaque_handle_t table  = filled();
    const table_picture      before = picture_of(table);
    expect_failure_without_record(RG_E_INVALID_COLUMN, rename_column(table, "nothing", "other"));
    expect_failure_without_record(RG_E_INVALID_COLUMN, rename_column(table, "val", "1st"));
    expect_failure_without_record(RG_E_INVALID_COLUMN, rename_column(table, "val", ""));
    expect_failure(RG_E_NULL_POINTER, rg_change_column_name_1(table, text("val"), nullptr));
    expect_failure(RG_E_NULL_POINTER, rg_change_column_name_1(table, nullptr, nullptr));
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(changing_a_default, leaves_rows_as_they_are_and_counts_for_rows_added_later)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}}), 0) << "a row of defaults";
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(change_default(table, "name", string("a default that is longer than the one before")), 0) << error_text();
    if (!persistent())
        make_committed(table);
    ASSERT_EQ(change_default(table, "val", int64(77)), 0);
    EXPECT_EQ(taken_string(read_key(table, uint32(4), "name", visible())), "none");
    EXPECT_EQ(read_key(table, uint32(4), "val", visible()).value.val_int64, -1);
    ASSERT_EQ(add_row(table, {{"id", uint32(5)}}), 0);
    EXPECT_EQ(taken_string(read_key(table, uint32(5), "name", 1)), "a default that is longer than the one before");
    EXPECT_EQ(read_key(table, uint32(5), "val", 1).value.val_int64, 77);
}

TEST_P(changing_a_default, to_a_null_pointer_gives_the_empty_value)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(change_default(table, "name", null_value()), 0);
    EXPECT_EQ(default_string_of(table, "name"), "");
}

TEST_P(changing_a_default, refuses_an_unknown_column_with_the_record_cleared)
{
    const rg_opaque_handle_t table  = filled();
    const table_picture      before = picture_of(table);
    expect_failure_without_record(RG_E_INVALID_COLUMN, change_default(table, "nothing", int64(1)));
    EXPECT_EQ(picture_of(table), before);
}

// ---- Columns that are hidden, or not named ----

TEST_P(changing_columns, of_a_table_with_an_invisible_column_can_neither_rename_nor_change_a_default)
{
    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE));
    const rg_opaque_handle_t table = make(columns);
    add_rows(table, three_rows());
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    for (const char * name : {"secret", "val"}) {
        expect_failure_without_record(RG_E_INVALID_COLUMN, rename_column(table, name, "other"));
        expect_failure_without_record(RG_E_INVALID_COLUMN, change_default(table, name, int64(1)));
    }
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(changing_columns, without_a_column_name_rebuilds_the_table_as_it_is)
{
    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE, int32(5)));
    const std::vector<std::function<kt_int32_t(rg_opaque_handle_t)>> rebuilds = {
        [](rg_opaque_handle_t t) { return rg_change_column_name_1(t, nullptr, text("other")); },
        [](rg_opaque_handle_t t) { return rg_change_default_value_1(t, nullptr, int64(1)); }};
    int number = 0;
    for (const auto & rebuild : rebuilds) {
        const rg_opaque_handle_t table =
            registry_of_tables::make(GetParam(), columns, explicit_writing, "t" + std::to_string(++number));
        add_rows(table, three_rows());
        ASSERT_EQ(commit(table), 0);
        const kt_uint64_t counter = object_of(table).change_counter;
        EXPECT_EQ(rebuild(table), 0) << error_text();
        EXPECT_EQ(object_of(table).change_counter, counter + 1);
        EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val", "secret"}));
        EXPECT_EQ(rows_in(table, visible()), three_rows());
    }
}

// ---- What is asked of the table ----

TEST_P(changing_columns, needs_a_table_that_is_open_for_writing)
{
    const rg_opaque_handle_t table = filled();
    object_of(table).mode          = RG_MODE_READ;
    const table_picture before     = picture_of(table);
    for (const column_change & change : all_changes())
        expect_failure(RG_E_ACCESS, change.make(table));
    EXPECT_EQ(picture_of(table), before);
    object_of(table).mode = RG_MODE_WRITE;
}

TEST_P(changing_columns, needs_a_table_with_nothing_pending_and_nothing_applied)
{
    const rg_opaque_handle_t table   = filled();
    const auto               refused = [&](const char * state) {
        SCOPED_TRACE(state);
        const table_picture before = picture_of(table);
        for (const column_change & change : all_changes()) {
            SCOPED_TRACE(change.name);
            expect_failure(RG_E_UNCOMMITTED_TABLE, change.make(table));
        }
        EXPECT_EQ(picture_of(table), before);
    };
    ASSERT_EQ(set_fields_by_key(table, uint32(1), {{"val", int64(11)}}), 0);
    refused("updated");
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    refused("applied");
    ASSERT_EQ(rg_commit_1(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    refused("deleted");
    ASSERT_EQ(rg_abort_1(table), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    refused("applied with nothing pending");
    ASSERT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(all_changes()[0].make(table), 0);
}

// ---- What the table is afterwards ----

TEST_P(changing_columns, counts_one_change_and_leaves_nothing_to_commit_or_abort)
{
    int number = 0;
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        const rg_opaque_handle_t table   = filled(explicit_writing, "t" + std::to_string(++number));
        const kt_uint64_t        counter = object_of(table).change_counter;
        ASSERT_EQ(change.make(table), 0) << error_text();
        const rg_i_table_t & object = object_of(table);
        EXPECT_EQ(object.change_counter, counter + 1);
        EXPECT_EQ(object.ready_for_commit, 0u);
        EXPECT_EQ(object.p_rows_change_list, nullptr);
        EXPECT_EQ(object.p_delete_rows_change_list, nullptr);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(rg_abort_1(table), 0);
        EXPECT_EQ(object.change_counter, counter + 1);
        EXPECT_EQ(object.total_applied_rows, 3u);
    }
}

TEST_P(changing_columns, leaves_the_tables_name_mode_control_and_references)
{
    int number = 0;
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        const rg_opaque_handle_t table  = filled(explicit_writing, "t" + std::to_string(++number));
        const rg_i_table_t       before = object_of(table);
        const std::string        name   = before.p_name;
        ASSERT_EQ(change.make(table), 0);
        const rg_i_table_t & after = object_of(table);
        EXPECT_EQ(after.p_name, name);
        EXPECT_EQ(after.mode, before.mode);
        EXPECT_EQ(after.implicitly_controlled, 0u);
        EXPECT_EQ(after.references, 1u);
        EXPECT_EQ(after.p_tree, before.p_tree);
        EXPECT_EQ(after.block_size, before.block_size);
        EXPECT_EQ(after.p_file_path, before.p_file_path);
        EXPECT_EQ(after.p_persistent_table_registry_path, before.p_persistent_table_registry_path);
    }
}

TEST_P(changing_columns, shows_at_once_through_every_handle_of_the_table)
{
    const rg_opaque_handle_t table = filled(implicit_writing);
    const rg_opaque_handle_t other = open_table(tree, persistent() ? "/kept/table" : "/scratch/table", RG_MODE_READ);
    ASSERT_NE(other, nullptr);
    ASSERT_EQ(rename_column(table, "name", "title"), 0);
    EXPECT_EQ(taken_string(read_key(other, uint32(1), "title", visible())), "alpha");
    EXPECT_EQ(rg_close_table_1(other), 0);
}

TEST_P(changing_columns, keeps_a_hash_table_of_the_same_buckets_and_functions)
{
    const rg_opaque_handle_t table = filled();
    for (const column_change & change : {all_changes()[3], all_changes()[1]}) {
        const rg_hash_table_t * p_before = object_of(table).p_rows_hash_table;
        const kt_uint32_t       buckets  = p_before != nullptr ? p_before->total_hash_buckets : 0;
        if (!persistent())
            make_committed(table);
        ASSERT_EQ(change.make(table), 0) << change.name;
        const rg_hash_table_t * p_after = object_of(table).p_rows_hash_table;
        ASSERT_EQ(p_after != nullptr, GetParam().hashed);
        if (p_after != nullptr) {
            EXPECT_EQ(p_after->total_hash_buckets, buckets);
            EXPECT_EQ(p_after->p_hash_function, &hash_uint32);
            EXPECT_EQ(p_after->p_compare_function, &compare_uint32);
        }
        for (kt_uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(find_key(table, uint32(id)), id - 1);
        EXPECT_EQ(find_key(table, uint32(4)), -RG_E_NO_SUCH_KEY);
    }
}

TEST_P(changing_columns, closes_the_holes_so_that_rows_stand_from_slot_0_on)
{
    for (const bool deletes : {false, true}) {
        SCOPED_TRACE(deletes);
        const rg_opaque_handle_t table =
            registry_of_tables::make(GetParam(), three_columns(), explicit_writing, deletes ? "d" : "a");
        for (kt_uint32_t id = 0; id < 6; ++id)
            ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
        ASSERT_EQ(commit(table), 0); // positions: 0 5 2 3 4, slots: 0 . 2 3 4 5
        ASSERT_EQ(deletes ? delete_columns(table, {"val"}) : add_columns(table, {column("extra", KT_INT32)}), 0);
        // A rebuild reads by position, a deletion by slot.
        const std::vector<kt_uint32_t> order =
            deletes ? std::vector<kt_uint32_t>{0, 2, 3, 4, 5} : std::vector<kt_uint32_t>{0, 5, 2, 3, 4};
        for (kt_uint32_t slot = 0; slot < 5; ++slot)
            EXPECT_EQ(read_fixed(table, slot, "id", 1).value.val_uint32, order[slot]) << slot;
        EXPECT_NE(read_fixed(table, 5, "id", 1).rc, 0);
    }
}

// The positions go on naming slots of the old table. Where the key is found by a walk of the positions, the row that no
// position leads to is missed.
TEST_P(changing_columns, of_a_table_that_ever_lost_a_row_leaves_packed_positions_that_lead_astray)
{
    const rg_opaque_handle_t table = make(three_columns());
    for (kt_uint32_t id = 0; id < 6; ++id)
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    const kt_uint32_t * p_positions = object_of(table).p_rows_packed_index;
    EXPECT_EQ(std::vector<kt_uint32_t>(p_positions, p_positions + 5), (std::vector<kt_uint32_t>{0, 5, 2, 3, 4}));
    EXPECT_EQ(read_packed(table, 1, "id", 1).rc, RG_E_ROW_DELETED) << "slot 5 is free now";
    EXPECT_EQ(read_packed(table, 2, "id", 1).value.val_uint32, 2u);
    EXPECT_EQ(find_key(table, uint32(5)), GetParam().hashed ? 1 : -RG_E_NO_SUCH_KEY) << "it stands in slot 1";
}

// A table of three hundred rows, so that both indices grow on the way, and of a key that stands behind the others.
TEST_P(changing_columns, carries_many_rows_and_a_key_that_was_given_as_third_column)
{
    const rg_opaque_handle_t table = make({column("name", KT_CHAR_PTR, RG_STANDARD, string("none")),
                                           column("val", KT_INT64), column("id", KT_UINT32, RG_PRIMARY_KEY)});
    named_rows               rows;
    for (kt_uint32_t id = 0; id < 300; ++id)
        rows[id] = {std::string(id % 90, 'x'), id};
    add_rows(table, rows);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_CHAR_PTR, RG_STANDARD, string("e"))}), 0);
    EXPECT_EQ(rows_in(table, visible()), rows);
    EXPECT_EQ(object_of(table).maximum_rows, 400u);
    for (kt_uint32_t position = 0; position < 300; ++position)
        EXPECT_EQ(read_packed(table, position, "id", visible()).value.val_uint32, position);
}

TEST_P(changing_columns, of_an_empty_table_works)
{
    const rg_opaque_handle_t table = make(three_columns());
    for (const column_change & change : {all_changes()[0], all_changes()[3], all_changes()[2], all_changes()[0]}) {
        if (change.name == std::string("add"))
            (void)delete_columns(table, {"extra"});
        EXPECT_EQ(change.make(table), 0) << change.name << error_text();
    }
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "value", "extra"}));
}

TEST_P(changing_columns, of_rows_with_one_key_is_refused_and_loses_nothing)
{
    const rg_opaque_handle_t table = filled();
    if (GetParam().hashed) {
        object_of(table).p_columns[0].qualifier = RG_PRIMARY_KEY_NOCHECK;
        ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
        object_of(table).p_columns[0].qualifier = RG_PRIMARY_KEY;
    } else {
        ASSERT_EQ(set_fields_by_key(table, uint32(2), {{"id", uint32(1)}}), 0);
    }
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    expect_failure_without_record(RG_E_DUPLICATE_KEY, add_columns(table, {column("extra", KT_INT32)}));
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(changing_columns, traces_its_entry_the_release_of_the_description_and_its_exit)
{
    const std::map<std::string, std::uint32_t> ids    = {{"add", 3}, {"delete", 27}, {"rename", 9}, {"default", 11}};
    int                                        number = 0;
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        const rg_opaque_handle_t table = filled(explicit_writing, "t" + std::to_string(++number));
        trace_catcher            trace(1, 0);
        ASSERT_EQ(change.make(table), 0);
        std::vector<std::uint32_t> seen;
        for (const event & e : trace.events())
            seen.push_back(e.id);
        const std::uint32_t id        = ids.at(change.name);
        const bool          describes = !is_deletion(change);
        EXPECT_EQ(seen, describes ? (std::vector<std::uint32_t>{id, 37, 38, id + 1})
                                  : (std::vector<std::uint32_t>{id, id + 1}));
    }
}

} // namespace kt_test
