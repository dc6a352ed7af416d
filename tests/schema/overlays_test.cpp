// SPDX-License-Identifier: MIT
// Overlays: changes of a column's definition in memory.
#include "schema/columns_kit.h"
#include "storage/table_files.h"
#include "support/trace.h"

namespace kt_test
{

struct overlaying_a_default_value : on_each_table_of_three_rows {
};
struct overlaying_a_qualifier : on_each_table_of_three_rows {
};
struct an_overlay : on_each_table_of_three_rows {
};
ON_EACH_KIND_OF_TABLE(overlaying_a_default_value);
ON_EACH_KIND_OF_TABLE(overlaying_a_qualifier);
ON_EACH_KIND_OF_TABLE(an_overlay);

// ---- Defaults ----

TEST_P(overlaying_a_default_value, counts_for_rows_added_from_then_on_and_for_no_other)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}}), 0);
    ASSERT_EQ(overlay_default(table, "name", string("some")), 0);
    ASSERT_EQ(overlay_default(table, "val", int64(-2)), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(5)}}), 0);
    EXPECT_EQ(taken_string(read_key(table, uint32(4), "name", 1)), "none");
    EXPECT_EQ(read_key(table, uint32(4), "val", 1).value.val_int64, -1);
    EXPECT_EQ(taken_string(read_key(table, uint32(5), "name", 1)), "some");
    EXPECT_EQ(read_key(table, uint32(5), "val", 1).value.val_int64, -2);
}

TEST_P(overlaying_a_default_value, of_the_same_length_works_any_number_of_times)
{
    const rg_opaque_handle_t table = filled();
    for (int i = 0; i < 100; ++i) {
        const std::string value = i % 2 == 0 ? "even" : "odd!";
        ASSERT_EQ(overlay_default(table, "name", string(value)), 0);
        EXPECT_EQ(default_string_of(table, "name"), value);
    }
}

TEST_P(overlaying_a_default_value, with_a_shorter_one_gives_the_difference_up)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(overlay_default(table, "name", string("no")), 0);
    EXPECT_EQ(default_string_of(table, "name"), "no");
    expect_failure(RG_E_NO_ROWS_TO_DELETE, overlay_default(table, "name", string("none")));
    EXPECT_EQ(default_string_of(table, "name"), "no");
    EXPECT_EQ(overlay_default(table, "name", string("ok")), 0);
}

TEST_P(overlaying_a_default_value, with_a_longer_one_is_refused_by_the_code_of_a_deletion_without_rows)
{
    const rg_opaque_handle_t table = filled();
    expect_failure(RG_E_NO_ROWS_TO_DELETE, overlay_default(table, "name", string("nones")));
    EXPECT_NE(error_text().find("row"), std::string::npos) << error_text();
    EXPECT_EQ(default_string_of(table, "name"), "none");
    EXPECT_EQ(column_of(table, "name").default_value.val_uint64 >> 32, 5u)
        << "the anchor's length, terminator included";
}

TEST_P(overlaying_a_default_value, with_null_stores_the_empty_value)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(overlay_default(table, "name", null_value()), 0);
    EXPECT_EQ(default_string_of(table, "name"), "");
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}}), 0);
    EXPECT_EQ(taken_string(read_key(table, uint32(4), "name", 1)), "");
    EXPECT_EQ(overlay_default(table, "name", string("")), 0);
}

TEST_P(overlaying_a_default_value, leaves_the_defaults_of_other_columns_alone)
{
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR, RG_STANDARD, string("first")),
              column("b", KT_CHAR_PTR, RG_STANDARD, string("second")),
              column("c", KT_CHAR_PTR, RG_STANDARD, string("third"))});
    ASSERT_EQ(overlay_default(table, "b", string("2nd")), 0);
    EXPECT_EQ(default_string_of(table, "a"), "first");
    EXPECT_EQ(default_string_of(table, "b"), "2nd");
    EXPECT_EQ(default_string_of(table, "c"), "third");
}

TEST_P(overlaying_a_default_value, takes_invisible_columns_and_the_key_and_refuses_unknown_ones)
{
    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE));
    const rg_opaque_handle_t table = make(columns);
    EXPECT_EQ(overlay_default(table, "secret", int32(8)), 0);
    EXPECT_EQ(column_of(table, "secret").default_value.val_int32, 8);
    EXPECT_EQ(overlay_default(table, "id", uint32(77)), 0);
    EXPECT_EQ(column_of(table, "id").default_value.val_uint32, 77u);
    expect_failure(RG_E_INVALID_COLUMN, overlay_default(table, "nothing", int32(8)));
    expect_failure(RG_E_INVALID_COLUMN, overlay_default(table, "NAME", int32(8)));
    expect_failure(RG_E_NULL_POINTER, rg_overlay_memory_default_value_1(table, nullptr, int32(8)));
}

TEST_P(overlaying_a_default_value, of_other_variable_length_types_goes_by_their_stored_length)
{
    kt_array_t * p_three   = static_cast<kt_array_t *>(std::calloc(1, sizeof(kt_array_t) + 2 * sizeof(kt_value_t)));
    p_three->element_count = 3;
    for (int i = 0; i < 3; ++i)
        p_three->elements[i] = int32(i);
    kt_value_t array = null_value();
    array.ptr_array  = p_three;
    kt_binary_t bytes_of_one{1, {9}};
    kt_value_t  binary = null_value();
    binary.ptr_binary  = &bytes_of_one;
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("list", KT_INT32_ARRAY, RG_STANDARD, array),
              column("bytes", KT_BINARY_PTR, RG_STANDARD, binary),
              column("nothing", KT_BINARY_PTR, RG_STANDARD, null_value())});
    p_three->element_count = 2;
    EXPECT_EQ(overlay_default(table, "list", array), 0);
    p_three->element_count = 3;
    expect_failure(RG_E_NO_ROWS_TO_DELETE, overlay_default(table, "list", array));
    EXPECT_EQ(overlay_default(table, "list", null_value()), 0);
    std::free(p_three);
    EXPECT_EQ(overlay_default(table, "bytes", binary), 0);
    EXPECT_EQ(overlay_default(table, "nothing", null_value()), 0);
    expect_failure(RG_E_NO_ROWS_TO_DELETE, overlay_default(table, "nothing", binary));
    const description d(table, -1);
    EXPECT_EQ(d->column_definitions[1].default_value.ptr_array->element_count, 0u);
    EXPECT_EQ(d->column_definitions[2].default_value.ptr_binary->data[0], 9);
}

TEST_P(overlaying_a_default_value, that_can_not_be_stored_is_a_failure_of_the_value_library)
{
    kt_structured_data_t broken{1, 0, {{KT_NONE, 0, int32(5)}}}; // no such element can be stored
    kt_value_t           value = null_value();
    value.ptr_sd               = &broken;
    two_fields           definition;
    kt_structured_data_t sound{1, 0, {{KT_INT32, 0, int32(5)}}};
    kt_value_t           sound_value = null_value();
    sound_value.ptr_sd               = &sound;
    rg_column_t sd                   = column("sd", KT_SD_PTR, RG_STANDARD, sound_value);
    sd.sd_defn                       = reinterpret_cast<rg_sd_def_t *>(&definition);
    const rg_opaque_handle_t table   = make({column("id", KT_UINT32, RG_PRIMARY_KEY), sd});
    expect_failure(RG_E_LIBRARY_CALL, overlay_default(table, "sd", value));
    EXPECT_NE(error_text().find("kt_pmsg_build_conv_protocol_value"), std::string::npos) << error_text();
    EXPECT_EQ(description(table, -1)->column_definitions[1].default_value.ptr_sd->element_count, 1u);
}

// ---- Qualifiers ----

TEST_P(overlaying_a_qualifier, sets_the_flags_of_a_standard_column_as_they_are)
{
    const rg_opaque_handle_t table = filled();
    for (const rg_qualifier_t flags :
         {RG_PROTECTED + 0u, RG_INVISIBLE + 0u, RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED + 0u, 112u, 0u, 0xFFFFFF00u}) {
        EXPECT_EQ(overlay_qualifier(table, "val", RG_STANDARD | flags), 0);
        EXPECT_EQ(column_of(table, "val").qualifier, RG_STANDARD | flags);
    }
}

TEST_P(overlaying_a_qualifier, hides_a_column_and_shows_it_again)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_INVISIBLE), 0);
    EXPECT_EQ(description(table, 1)->number_of_columns, 2u);
    EXPECT_EQ(description(table, -1)->number_of_columns, 3u);
    expect_failure(RG_E_INVALID_COLUMN, delete_columns(table, {"val"}));
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD), 0);
    EXPECT_EQ(description(table, 1)->number_of_columns, 3u);

    std::vector<rg_column_t> columns = three_columns();
    columns.push_back(column("secret", KT_INT32, RG_STANDARD | RG_INVISIBLE));
    const rg_opaque_handle_t other = registry_of_tables::make(GetParam(), columns, explicit_writing, "other");
    ASSERT_EQ(overlay_qualifier(other, "secret", RG_STANDARD), 0);
    EXPECT_EQ(description(other, 1)->number_of_columns, 4u);
    EXPECT_EQ(rename_column(other, "secret", "known"), 0) << "which a hidden column wouldn't let through";
}

TEST_P(overlaying_a_qualifier, neither_makes_a_key_nor_unmakes_one)
{
    std::vector<rg_column_t> columns = three_columns();
    const rg_opaque_handle_t table   = make(columns);
    for (const rg_qualifier_t refused :
         {RG_PRIMARY_KEY + 0u, RG_PRIMARY_KEY_NOCHECK + 0u, RG_SYSTEM + 0u, 0u, 16u, 32u, 96u})
        expect_failure(RG_E_INVALID_COLUMN, overlay_qualifier(table, "val", refused));
    expect_failure(RG_E_INVALID_COLUMN, overlay_qualifier(table, "id", RG_STANDARD));
    expect_failure(RG_E_INVALID_COLUMN, overlay_qualifier(table, "id", RG_PRIMARY_KEY));
    expect_failure(RG_E_INVALID_COLUMN, overlay_qualifier(table, "nothing", RG_STANDARD));
    expect_failure(RG_E_INVALID_COLUMN, rg_overlay_memory_column_qualifier_1(table, nullptr, RG_PRIMARY_KEY));
    expect_failure(RG_E_NULL_POINTER, rg_overlay_memory_column_qualifier_1(table, nullptr, RG_STANDARD));
    EXPECT_EQ(column_of(table, "val").qualifier, rg_qualifier_t{RG_STANDARD});
    EXPECT_EQ(column_of(table, "id").qualifier, rg_qualifier_t{RG_PRIMARY_KEY});
}

TEST_P(overlaying_a_qualifier, governs_updates_at_once)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED), 0);
    ASSERT_EQ(set_fields_by_key(table, uint32(1), {{"name", string("x")}}), 0);
    EXPECT_EQ(read_key(table, uint32(1), "val", 1).value.val_int64, -1);
}

// ---- Both ----

TEST_P(an_overlay, is_no_pending_update_and_counts_no_change)
{
    const rg_opaque_handle_t table   = filled();
    const kt_uint64_t        counter = object_of(table).change_counter;
    ASSERT_EQ(set_fields_by_key(table, uint32(1), {{"val", int64(11)}}), 0);
    const table_picture before = picture_of(table);
    ASSERT_EQ(overlay_default(table, "name", string("some")), 0);
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_PROTECTED), 0);
    EXPECT_EQ(picture_of(table), before);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(overlay_default(table, "name", string("nona")), 0) << "also of an applied table";
    ASSERT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(default_string_of(table, "name"), "nona") << "no abort takes it back";
    EXPECT_EQ(column_of(table, "val").qualifier, rg_qualifier_t{RG_STANDARD | RG_PROTECTED});
    EXPECT_EQ(object_of(table).change_counter, counter);
}

TEST_P(an_overlay, works_on_a_table_that_is_open_for_reading)
{
    const rg_opaque_handle_t table = reopened(filled());
    ASSERT_EQ(object_of(table).mode & RG_MODE_WRITE, persistent() ? 0u : object_of(table).mode & RG_MODE_WRITE);
    EXPECT_EQ(overlay_default(table, "name", string("some")), 0);
    EXPECT_EQ(overlay_qualifier(table, "name", RG_STANDARD | RG_INVISIBLE), 0);
    EXPECT_EQ(default_string_of(table, "name"), "some");
}

TEST_P(an_overlay, goes_along_with_a_column_change)
{
    const rg_opaque_handle_t table = filled();
    ASSERT_EQ(overlay_default(table, "name", string("abc")), 0);
    ASSERT_EQ(overlay_qualifier(table, "name", RG_STANDARD | RG_PROTECTED), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    EXPECT_EQ(default_string_of(table, "name"), "abc");
    EXPECT_EQ(column_of(table, "name").qualifier, rg_qualifier_t{RG_STANDARD | RG_PROTECTED});
    expect_failure(RG_E_NO_ROWS_TO_DELETE, overlay_default(table, "name", string("none")));
}

TEST_P(an_overlay, is_traced_under_its_own_numbers)
{
    const rg_opaque_handle_t table = filled();
    trace_catcher            trace(1, 0);
    ASSERT_EQ(overlay_default(table, "val", int64(1)), 0);
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD), 0);
    std::vector<std::uint32_t> seen;
    for (const event & e : trace.events())
        seen.push_back(e.id);
    EXPECT_EQ(seen, (std::vector<std::uint32_t>{85, 86, 83, 84}));
}

// ---- Files ----

TEST(an_overlay_of_a_file, ends_with_the_table_object_as_long_as_commits_append)
{
    registry_of_tables r;
    rg_opaque_handle_t table  = r.make({false, true}, three_columns(), registry_of_tables::implicit_writing);
    const bytes        before = read_file(r.directory.file("table"));
    ASSERT_EQ(overlay_default(table, "name", string("some")), 0);
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_PROTECTED), 0);
    EXPECT_EQ(to_hex(read_file(r.directory.file("table"))), to_hex(before)) << "nothing is written";
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(rg_close_table_1(table), 0);
    table = open_table(r.tree, "/kept/table", RG_MODE_READ);
    EXPECT_EQ(default_string_of(table, "name"), "none");
    EXPECT_EQ(column_of(table, "val").qualifier, rg_qualifier_t{RG_STANDARD});
    EXPECT_EQ(taken_string(read_key(table, uint32(1), "name")), "some") << "the row was made with it";
}

TEST(an_overlay_of_a_file, is_carried_to_disk_by_a_rewrite_and_by_a_copy)
{
    registry_of_tables r;
    rg_opaque_handle_t table = r.make({false, true}, three_columns());
    ASSERT_EQ(overlay_default(table, "name", string("abc")), 0);
    ASSERT_EQ(overlay_qualifier(table, "val", RG_STANDARD | RG_PROTECTED), 0);
    ASSERT_EQ(rg_copy_table_by_handle_1(table, text("/kept/copy"), 0), 0);
    ASSERT_EQ(rg_i_apply(&object_of(table), 1, 0), 0);
    ASSERT_EQ(rg_i_commit(&object_of(table)), 0);
    ASSERT_EQ(rg_close_table_1(table), 0);
    for (const char * path : {"/kept/table", "/kept/copy"}) {
        table = open_table(r.tree, path, RG_MODE_READ);
        ASSERT_NE(table, nullptr);
        EXPECT_EQ(default_string_of(table, "name"), "abc");
        EXPECT_EQ(column_of(table, "val").qualifier, rg_qualifier_t{RG_STANDARD | RG_PROTECTED});
    }
}

// In a damaged file a default may lie where names do. Written there, it would take their terminators.
TEST(an_overlay_of_a_damaged_table, whose_default_lies_among_names_is_refused)
{
    registry_of_tables       r;
    const rg_opaque_handle_t table = r.make({false, false}, three_columns());
    rg_column_t &            name  = column_of(table, "name");
    const rg_column_t        sound = name;
    const auto               lead  = [&](std::uint64_t offset, std::uint64_t length) {
        name.default_value.val_uint64 = offset | length << 32;
    };
    const kt_uint32_t data_length = rg_i_default_data_length(&object_of(table));
    ASSERT_EQ(data_length, 5u);
    lead(0, 6);
    expect_failure(RG_E_TABLE_UNREADABLE, overlay_default(table, "name", string("x")));
    lead(3, 3);
    expect_failure(RG_E_TABLE_UNREADABLE, overlay_default(table, "name", string("x")));
    lead(0xFFFFFFFF, 5);
    expect_failure(RG_E_TABLE_UNREADABLE, overlay_default(table, "name", string("x")));
    // A name ahead of the first one, among the defaults.
    name.default_value       = sound.default_value;
    rg_column_t & val        = column_of(table, "val");
    kt_char_ptr_t p_val_name = val.name;
    kt_char_ptr_t p_defaults = rg_i_default_data(&object_of(table));
    val.name                 = p_defaults + 2; // "ne"
    expect_failure(RG_E_TABLE_UNREADABLE, overlay_default(table, "name", string("abcd")));
    EXPECT_STREQ(p_defaults, "none");
    val.name = p_val_name;
    EXPECT_EQ(overlay_default(table, "name", string("abcd")), 0);
}

} // namespace kt_test
