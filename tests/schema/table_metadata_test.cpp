// SPDX-License-Identifier: MIT
// What a table tells about itself.
#include <cstdlib>

#include "schema/columns_kit.h"
#include "support/faults.h"

namespace
{

using namespace kt_test;

std::vector<rg_column_t> columns_with_an_invisible_one()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("none")),
            column("secret", KT_INT64, RG_STANDARD | RG_INVISIBLE, int64(-7))};
}

TEST(describing_a_table, without_definitions_all_columns_are_counted)
{
    open_tree         tree;
    const description d(create_table(tree, "/t", columns_with_an_invisible_one(), RG_MODE_WRITE), 0);
    EXPECT_STREQ(d->name, "/t");
    EXPECT_EQ(d->number_of_columns, 3u);
    EXPECT_EQ(d->column_definitions, nullptr);
    EXPECT_EQ(d->table_change_counter, 1u);
    EXPECT_EQ(d->properties, 0);
}

TEST(describing_a_table, only_visible_columns_are_described_and_counted_unless_all_are_asked_for)
{
    open_tree          tree;
    rg_opaque_handle_t table = create_table(tree, "/t", columns_with_an_invisible_one(), RG_MODE_WRITE);
    for (const kt_int32_t any_other : {1, 2, -2}) {
        const description d(table, any_other);
        ASSERT_EQ(d->number_of_columns, 2u);
        EXPECT_STREQ(d->column_definitions[1].name, "name");
    }
    const description d(table, -1);
    ASSERT_EQ(d->number_of_columns, 3u);
    EXPECT_STREQ(d->column_definitions[0].name, "id");
    EXPECT_EQ(d->column_definitions[0].qualifier, rg_qualifier_t{RG_PRIMARY_KEY});
    EXPECT_STREQ(d->column_definitions[1].default_value.ptr_char, "none");
    EXPECT_STREQ(d->column_definitions[2].name, "secret");
    EXPECT_EQ(d->column_definitions[2].type, kt_data_type_t{KT_INT64});
    EXPECT_EQ(d->column_definitions[2].default_value.val_int64, -7);
}

TEST(describing_a_table, the_description_outlives_the_handle_and_the_tree)
{
    rg_table_metadata_t * p = nullptr;
    {
        open_tree tree;
        ASSERT_EQ(
            rg_get_table_metadata_1(create_table(tree, "/t", columns_with_an_invisible_one(), RG_MODE_WRITE), -1, &p),
            0);
    }
    EXPECT_STREQ(p->column_definitions[1].default_value.ptr_char, "none");
    EXPECT_EQ(rg_free_table_metadata_1(p), 0);
}

TEST(describing_a_table, definitions_and_defaults_of_structured_data_come_in_client_form)
{
    two_fields           definition;
    kt_structured_data_t one{1, 0, {{KT_INT32, 0, int32(5)}}};
    kt_value_t           value = null_value();
    value.ptr_sd               = &one;
    rg_column_t sd             = column("sd", KT_SD_PTR, RG_STANDARD, value);
    sd.sd_defn                 = reinterpret_cast<rg_sd_def_t *>(&definition);
    sd.properties              = 11;

    open_tree           tree;
    const description   d(create_table(tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY), sd}, RG_MODE_WRITE), -1);
    const rg_column_t & c = d->column_definitions[1];
    EXPECT_EQ(c.properties, 11);
    ASSERT_NE(c.sd_defn, nullptr);
    ASSERT_EQ(c.sd_defn->number_of_fields, 2u);
    const rg_field_def_t * p_fields = c.sd_defn->fields;
    EXPECT_EQ(p_fields[0].type, kt_data_type_t{KT_INT32});
    EXPECT_STREQ(p_fields[0].name, "first");
    EXPECT_EQ(p_fields[1].type, kt_data_type_t{KT_CHAR_PTR});
    EXPECT_STREQ(p_fields[1].name, "second");
    ASSERT_EQ(c.default_value.ptr_sd->element_count, 1u);
    EXPECT_EQ(c.default_value.ptr_sd->elements[0].data_type, kt_data_type_t{KT_INT32});
    EXPECT_EQ(c.default_value.ptr_sd->elements[0].value.val_int32, 5);
}

TEST(describing_a_table, a_persistent_table_tells_its_registry_path)
{
    temp_dir  dir;
    open_tree tree;
    tree.mount("/m", dir.path());
    const description d(create_table(tree, "/m/t", {column("id", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE), 0);
    EXPECT_STREQ(d->name, "/m/t");
}

TEST(describing_a_table, an_unnamed_table_has_the_empty_name)
{
    open_tree          tree;
    rg_opaque_handle_t table  = create_table(tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE);
    auto *             p      = static_cast<rg_i_table_t *>(table);
    kt_char_ptr_t      p_name = std::exchange(p->p_name, nullptr);
    {
        const description d(table, 0);
        EXPECT_STREQ(d->name, "");
    }
    p->p_name = p_name;
}

TEST(describing_a_table, rows_are_the_committed_ones_and_pending_deletions_count_where_updates_show)
{
    open_tree          tree;
    rg_opaque_handle_t table =
        create_table(tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_commit_1(table), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
    EXPECT_EQ(description(table, 0)->number_of_rows, 1u);

    static_cast<rg_i_table_t *>(table)->uncommitted_updates_visible = 1;
    EXPECT_EQ(description(table, 0)->number_of_rows, 2u);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(description(table, 0)->number_of_rows, 2u);
    EXPECT_EQ(description(table, 0)->table_change_counter, 2u);
}

TEST(describing_a_table, wrong_arguments_are_refused)
{
    open_tree             tree;
    rg_opaque_handle_t    table = create_table(tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY)}, RG_MODE_WRITE);
    rg_table_metadata_t * p     = nullptr;
    EXPECT_EQ(rg_get_table_metadata_1(nullptr, 0, &p), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_get_table_metadata_1(table, 0, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_free_table_metadata_1(nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
}

// The release of what was made is a call that succeeds, and so clears the record; if there was nothing to release it
// is a call with a NULL pointer.
TEST(describing_a_table, after_a_failure_the_error_record_tells_of_the_release)
{
    two_fields  definition;
    rg_column_t sd = column("sd", KT_SD_PTR, RG_STANDARD, null_value());
    sd.sd_defn     = reinterpret_cast<rg_sd_def_t *>(&definition);
    open_tree          tree;
    rg_opaque_handle_t table = create_table(
        tree, "/t",
        {column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("x")), sd},
        RG_MODE_WRITE);
    unsigned nth = 1;
    for (;; ++nth) {
        const fault_scope     faults;
        rg_table_metadata_t * p = nullptr;
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc = rg_get_table_metadata_1(table, -1, &p);
        if (!failed_as_asked(call::allocation)) {
            ASSERT_EQ(rc, 0);
            EXPECT_EQ(rg_free_table_metadata_1(p), 0);
            break;
        }
        EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL) << nth; // the latter for a default value
        EXPECT_EQ(error_code(), nth == 1 ? RG_E_NULL_POINTER : 0) << nth;
        EXPECT_EQ(p, nullptr);
    }
    EXPECT_GT(nth, 8u);
}

} // namespace
