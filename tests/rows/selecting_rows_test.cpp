// SPDX-License-Identifier: MIT
// Selecting rows: result tables with all columns or some, and the three row lists.
#include <algorithm>
#include <cstdarg>

#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

using ids = std::vector<kt_uint32_t>;

constexpr rg_row_state_t committed = RG_ROW_STATE_COMMITTED;

kt_int32_t selected_rows(rg_opaque_handle_t table, const char * p_criteria, kt_uint32_t visible, kt_uint32_t * p_total,
                         kt_uint32_t ** p_p_rows, ...)
{
    va_list ap;
    va_start(ap, p_p_rows);
    const kt_int32_t rc = rg_get_selected_rows_v_1(table, p_criteria != nullptr ? text(p_criteria) : nullptr, ap,
                                                   visible, p_total, p_p_rows);
    va_end(ap);
    return rc;
}

ids taken_list(kt_uint32_t * p_rows, kt_uint32_t total)
{
    const ids result(p_rows, p_rows + total);
    std::free(p_rows);
    return result;
}

ids selected(rg_opaque_handle_t table, const char * p_criteria, kt_uint32_t visible = 0)
{
    kt_uint32_t   total  = 99;
    kt_uint32_t * p_rows = nullptr;
    EXPECT_EQ(selected_rows(table, p_criteria, visible, &total, &p_rows), 0) << error_text();
    EXPECT_NE(p_rows, nullptr) << "also when it is empty";
    return taken_list(p_rows, total);
}

struct selecting_rows : on_each_kind_of_table {
    // Rows id 0 to rows - 1; n is the remainder by 3; s is "even" or "odd"; d is the half.
    rg_opaque_handle_t make_numbered(kt_uint32_t rows, kt_int32_t mode = explicit_writing)
    {
        const rg_opaque_handle_t table =
            make({column("n", KT_INT32), column("s", KT_CHAR_PTR, RG_STANDARD, string("default s")),
                  column("id", KT_UINT32, RG_PRIMARY_KEY), column("d", KT_FLOAT64, RG_STANDARD | RG_INVISIBLE)},
                 mode);
        add_numbered(table, 0, rows);
        return table;
    }
    static void add_numbered(rg_opaque_handle_t table, kt_uint32_t from, kt_uint32_t to)
    {
        for (kt_uint32_t row = from; row < to; ++row)
            ASSERT_EQ(add_row(table, {{"id", uint32(row)},
                                      {"n", int32(static_cast<std::int32_t>(row) % 3)},
                                      {"s", string(row % 2 == 0 ? "even" : "odd")},
                                      {"d", float64(row / 2.0)}}),
                      0);
    }
    static rg_opaque_handle_t select(rg_opaque_handle_t table, std::vector<const char *> columns,
                                     const char * p_criteria = nullptr)
    {
        std::vector<kt_char_ptr_t> names;
        for (const char * p_name : columns)
            names.push_back(text(p_name));
        rg_opaque_handle_t result = nullptr;
        EXPECT_EQ(rg_select_1(table, names.data(), static_cast<kt_uint32_t>(names.size()), &result,
                              p_criteria != nullptr ? text(p_criteria) : nullptr),
                  0)
            << error_text();
        return result;
    }
    static ids column_ids(rg_opaque_handle_t table)
    {
        ids result;
        for (kt_uint32_t packed = 0; packed < object_of(table).total_applied_rows; ++packed)
            result.push_back(read_packed(table, packed, "id").value.val_uint32);
        return result;
    }
    static std::vector<std::string> column_names(rg_opaque_handle_t table)
    {
        std::vector<std::string> names;
        for (kt_uint32_t i = 0; i < object_of(table).total_columns; ++i)
            names.emplace_back(object_of(table).p_columns[i].name);
        return names;
    }
};
ON_EACH_KIND_OF_TABLE(selecting_rows);

// ---- Result tables ----

TEST_P(selecting_rows, without_criteria_or_columns_copies_everything)
{
    const rg_opaque_handle_t table = make_numbered(7);
    ASSERT_EQ(commit(table), 0);
    const table_picture      before = picture_of(table);
    const rg_opaque_handle_t result = select(table, {});
    ASSERT_NE(result, nullptr);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(column_ids(result), (ids{0, 1, 2, 3, 4, 5, 6}));
    EXPECT_EQ(column_names(result), column_names(table));
    for (kt_uint32_t row = 0; row < 7; ++row) {
        EXPECT_EQ(taken_string(read_packed(result, row, "s")), row % 2 == 0 ? "even" : "odd");
        EXPECT_EQ(read_packed(result, row, "d").value.val_float64, row / 2.0);
        EXPECT_EQ(state_of(result, row), committed);
        EXPECT_EQ(find_key(result, uint32(row)), row) << "hashed like its source";
    }
    EXPECT_EQ(picture_of(table), before) << "the source isn't changed";
    picture_of(result);
    EXPECT_EQ(rg_close_table_1(result), 0);
}

TEST_P(selecting_rows, gives_a_table_object_with_the_settled_fields)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(commit(table), 0);
    const rg_opaque_handle_t result = select(table, {}, "id >= 1");
    const rg_i_table_t &     object = object_of(result);
    const rg_i_table_t &     source = object_of(table);
    EXPECT_EQ(object.p_name, nullptr);
    EXPECT_EQ(object.mode, 6u);
    EXPECT_EQ(object.implicitly_controlled, 1u) << "doesn't follow the mode";
    EXPECT_EQ(object.uncommitted_updates_visible, 0u);
    EXPECT_EQ(object.p_tree, source.p_tree);
    EXPECT_EQ(object.change_counter, source.change_counter + 1);
    EXPECT_EQ(object.total_applied_rows, 2u);
    EXPECT_EQ(object.total_committed_rows, 2u);
    EXPECT_EQ(object.maximum_rows, 3u) << "the rows of the source";
    EXPECT_EQ(object.p_file_path, nullptr);
    ASSERT_NE(object.p_application_metadata, nullptr);
    EXPECT_EQ(object.p_rows_hash_table != nullptr, GetParam().hashed);
    if (GetParam().hashed) {
        EXPECT_NE(object.p_rows_hash_table, source.p_rows_hash_table);
        EXPECT_EQ(object.p_rows_hash_table->total_hash_buckets, source.p_rows_hash_table->total_hash_buckets);
        EXPECT_EQ(object.p_rows_hash_table->p_hash_function, source.p_rows_hash_table->p_hash_function);
    }
    for (kt_uint32_t row = 0; row < 2; ++row) {
        EXPECT_TRUE(slot_of(result, row).p_applied == slot_of(result, row).p_committed);
        EXPECT_EQ(+slot_of(result, row).file_offset, 0u);
        EXPECT_EQ(slot_of(result, row).p_pending_change, nullptr);
    }
}

TEST_P(selecting_rows, by_criteria_copies_those_that_match)
{
    const rg_opaque_handle_t table = make_numbered(12);
    ASSERT_EQ(commit(table), 0);
    rg_opaque_handle_t result = nullptr;
    ASSERT_EQ(rg_select_1(table, nullptr, 0, &result, text("n == $i && s == $s"), 1, "odd"), 0) << error_text();
    EXPECT_EQ(column_ids(result), (ids{1, 7}));
    EXPECT_EQ(find_key(result, uint32(7)), 1) << "rows stand from fixed index 0 on";
    EXPECT_EQ(find_key(result, uint32(2)), -RG_E_NO_SUCH_KEY);
}

TEST_P(selecting_rows, that_match_nothing_gives_an_empty_table)
{
    const rg_opaque_handle_t table = make_numbered(120);
    ASSERT_EQ(commit(table), 0);
    const rg_opaque_handle_t result = select(table, {}, "id > 1000");
    EXPECT_EQ(object_of(result).total_applied_rows, 0u);
    EXPECT_EQ(object_of(result).maximum_rows, 120u);
    EXPECT_EQ(read_packed(result, 0, "id").rc, RG_E_NO_SUCH_INDEX);
}

TEST_P(selecting_rows, of_an_empty_table_sizes_the_index_at_10_rows)
{
    const rg_opaque_handle_t table = make_numbered(0);
    EXPECT_EQ(object_of(select(table, {})).maximum_rows, 10u);
}

TEST_P(selecting_rows, with_some_columns_has_the_key_first_and_the_others_in_the_callers_order)
{
    const rg_opaque_handle_t table = make_numbered(4);
    ASSERT_EQ(commit(table), 0);
    using names = std::vector<std::string>;
    EXPECT_EQ(column_names(table), (names{"id", "s", "n", "d"}));
    const rg_opaque_handle_t some = select(table, {"d", "s"});
    EXPECT_EQ(column_names(some), (names{"id", "d", "s"}));
    EXPECT_EQ(object_of(some).total_variable_length_columns, 1u);
    for (kt_uint32_t row = 0; row < 4; ++row) {
        EXPECT_EQ(taken_string(read_packed(some, row, "s")), row % 2 == 0 ? "even" : "odd");
        EXPECT_EQ(read_packed(some, row, "d").value.val_float64, row / 2.0);
        EXPECT_EQ(find_key(some, uint32(row)), row);
        EXPECT_EQ(rg_i_load_u32(slot_of(some, row).p_applied), 0u);
    }
    EXPECT_EQ(read_packed(some, 0, "n").rc, RG_E_INVALID_COLUMN);
    EXPECT_EQ(object_of(some).p_columns[1].qualifier, RG_STANDARD | RG_INVISIBLE);

    const rg_opaque_handle_t key_only = select(table, {"id"}, "s == \"odd\"");
    EXPECT_EQ(column_names(key_only), (names{"id"}));
    EXPECT_EQ(column_ids(key_only), (ids{1, 3}));
    const rg_opaque_handle_t key_last = select(table, {"n", "id"});
    EXPECT_EQ(column_names(key_last), (names{"id", "n"}));
    const rg_opaque_handle_t reordered = select(table, {"d", "n", "s", "id"});
    EXPECT_EQ(column_names(reordered), (names{"id", "d", "n", "s"}));
    EXPECT_EQ(taken_string(read_packed(reordered, 1, "s")), "odd");
}

TEST_P(selecting_rows, with_a_column_twice_or_more_columns_than_there_are_gives_the_right_result)
{
    const rg_opaque_handle_t table = make_numbered(0);
    const std::string        large(10'000, 'l');
    for (kt_uint32_t row = 0; row < 30; ++row)
        ASSERT_EQ(add_row(table, {{"id", uint32(row)}, {"s", string(large)}, {"n", int32(7)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const rg_opaque_handle_t result = select(table, {"s", "s", "n", "s", "n", "s", "s"});
    EXPECT_EQ(object_of(result).total_columns, 8u);
    EXPECT_EQ(object_of(result).total_variable_length_columns, 5u);
    for (kt_uint32_t row = 0; row < 30; ++row) {
        EXPECT_EQ(taken_string(read_packed(result, row, "s")), large);
        EXPECT_EQ(read_packed(result, row, "n").value.val_int32, 7);
        EXPECT_EQ(rg_i_record_data_length(slot_of(result, row).p_applied), 4u + 8 * 8 + 5 * 10'001);
    }
    picture_of(result);
}

TEST_P(selecting_rows, keeps_defaults_and_definitions_of_the_columns_it_has)
{
    rg_sd_def_t definition{1, {{KT_CHAR_PTR, text("field")}}};
    rg_column_t sd = column("sd", KT_SD_PTR, RG_STANDARD, null_value());
    sd.sd_defn     = &definition;
    const rg_opaque_handle_t table =
        make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("a", KT_CHAR_PTR, RG_STANDARD, string("default a")), sd,
              column("b", KT_CHAR_PTR, RG_STANDARD, string("default b"))});
    for (const std::vector<const char *> & names : {std::vector<const char *>{}, {"sd", "b"}}) {
        const rg_opaque_handle_t result = select(table, names);
        ASSERT_EQ(add_row(result, {{"id", uint32(1)}}), 0);
        EXPECT_EQ(taken_string(read_packed(result, 0, "b")), "default b");
        ASSERT_EQ(rg_delete_rows_1(result, text("sd.field == \"x\"")), 0) << "the field is known";
        EXPECT_NE(object_of(result).p_columns[1].name, object_of(table).p_columns[1].name);
    }
}

TEST_P(selecting_rows, gives_a_table_that_can_be_changed_and_outlives_changes_of_its_source)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    const rg_opaque_handle_t result = select(table, {});
    ASSERT_EQ(rg_delete_rows_1(table, nullptr), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(column_ids(result), (ids{0, 1, 2}));
    ASSERT_EQ(set_fields_by_key(result, uint32(1), {{"s", string("changed")}}), 0);
    EXPECT_EQ(taken_string(read_key(result, uint32(1), "s")), "changed") << "committed at once";
    ASSERT_EQ(rg_delete_row_by_index_1(result, 0), 0);
    EXPECT_EQ(object_of(result).total_applied_rows, 2u);
    const rg_opaque_handle_t of_result = select(result, {"s"}, "s == \"changed\"");
    EXPECT_EQ(column_ids(of_result), ids{1});
    EXPECT_EQ(rg_close_table_1(result), 0);
    EXPECT_EQ(column_ids(of_result), ids{1});
}

TEST_P(selecting_rows, sees_the_committed_state)
{
    const rg_opaque_handle_t table = make_numbered(4);
    ASSERT_EQ(commit(table), 0);
    add_numbered(table, 10, 11);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"s", string("new")}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 2), 0);
    const rg_opaque_handle_t result = select(table, {});
    EXPECT_EQ(column_ids(result), (ids{0, 1, 2, 3}));
    EXPECT_EQ(taken_string(read_packed(result, 1, "s")), "odd");
    EXPECT_EQ(column_ids(select(table, {}, "s == \"new\"")), ids{}) << "and judges by it";
}

TEST_P(selecting_rows, sees_the_applied_state_of_a_table_that_shows_it)
{
    ASSERT_EQ(setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "1", 1), 0);
    const rg_opaque_handle_t table = make_numbered(4);
    ASSERT_EQ(unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE"), 0);
    ASSERT_EQ(commit(table), 0);
    add_numbered(table, 10, 11);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"s", string("new")}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 2), 0);
    const rg_opaque_handle_t result = select(table, {});
    EXPECT_EQ(column_ids(result), (ids{0, 1, 3, 10}));
    EXPECT_EQ(column_ids(select(table, {}, "s == \"new\"")), ids{1});
    EXPECT_EQ(object_of(result).uncommitted_updates_visible, 0u) << "the environment's, not the source's";
}

TEST_P(selecting_rows, refuses_what_is_wrong_and_makes_nothing)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    rg_opaque_handle_t result = nullptr;
    kt_char_ptr_t      names[]{text("s"), text("nothing")};
    kt_char_ptr_t      null_name[]{nullptr};
    EXPECT_EQ(rg_select_1(nullptr, nullptr, 0, &result, nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_select_1(table, nullptr, 0, nullptr, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_select_1(table, nullptr, 1, &result, nullptr), RG_E_NO_COLUMNS);
    EXPECT_EQ(error_code(), RG_E_NO_COLUMNS);
    EXPECT_EQ(rg_select_1(table, names, 2, &result, nullptr), RG_E_INVALID_COLUMN);
    EXPECT_EQ(rg_select_1(table, null_name, 1, &result, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &result, text("$q")), RG_E_INVALID_VARIABLE_TYPE);
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &result, text("id ==")), RG_E_LIBRARY_CALL);
    EXPECT_NE(error_text().find("ku_comp_expr"), std::string::npos);
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &result, text("nothing == 1")), RG_E_LIBRARY_CALL);
    EXPECT_EQ(result, nullptr);
    EXPECT_EQ(static_cast<rg_i_tree_t *>(object_of(table).p_tree)->p_unnamed_tables, nullptr);
}

TEST_P(selecting_rows, counts_a_faulting_row_as_no_match)
{
    const rg_opaque_handle_t table = make_numbered(6);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(column_ids(select(table, {}, "6 / n == 3")), (ids{2, 5}));
}

TEST_P(selecting_rows, fails_cleanly_at_each_allocation)
{
    const rg_opaque_handle_t table = make_numbered(5);
    ASSERT_EQ(commit(table), 0);
    const table_picture before = picture_of(table);
    kt_char_ptr_t       names[]{text("s")};
    kt_char_ptr_t       criteria = text("s == $s");
    for (const kt_uint32_t columns : {0u, 1u})
        for (unsigned nth = 1;; ++nth) {
            rg_opaque_handle_t result = nullptr;
            kt_int32_t         rc     = 0;
            bool               failed = false;
            {
                const fault_scope faults;
                fail_call(call::allocation, nth, ENOMEM);
                rc     = rg_select_1(table, names, columns, &result, criteria, "odd");
                failed = failed_as_asked(call::allocation);
            }
            if (!failed) {
                EXPECT_EQ(rc, 0);
                EXPECT_EQ(column_ids(result), (ids{1, 3}));
                EXPECT_EQ(rg_close_table_1(result), 0);
                EXPECT_GT(nth, 8u);
                break;
            }
            EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL) << nth << " gave " << rc;
            EXPECT_EQ(error_code(), rc);
            EXPECT_EQ(result, nullptr);
        }
    EXPECT_EQ(picture_of(table), before);
}

TEST_P(selecting_rows, of_two_rows_that_were_set_to_one_key_is_refused_where_keys_are_hashed_and_checked)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"id", uint32(0)}}), 0);
    ASSERT_EQ(commit(table), 0);
    rg_opaque_handle_t result = nullptr;
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &result, nullptr), GetParam().hashed ? RG_E_DUPLICATE_KEY : 0);
    EXPECT_EQ(result == nullptr, GetParam().hashed);
}

TEST_P(selecting_rows, of_many_gives_a_table_that_finds_each_key_and_no_other)
{
    constexpr kt_uint32_t    rows  = 300;
    const rg_opaque_handle_t table = make_numbered(rows);
    ASSERT_EQ(commit(table), 0);
    const rg_opaque_handle_t result = select(table, {}, "n != 1 && id not in (64, 100, 299)");
    kt_uint32_t              slot   = 0;
    for (kt_uint32_t id = 0; id < rows + 10; ++id) {
        const bool is_there = id < rows && id % 3 != 1 && id != 299;
        EXPECT_EQ(find_key(result, uint32(id)), is_there ? std::int64_t{slot} : -RG_E_NO_SUCH_KEY) << id;
        slot += is_there ? 1 : 0;
    }
    picture_of(result);
    EXPECT_EQ(rg_close_table_1(result), 0);

    // Two of them come to have one key, far from each other.
    ASSERT_EQ(set_fields_by_fixed_index(table, 230, {{"id", uint32(3)}}), 0);
    ASSERT_EQ(commit(table), 0);
    rg_opaque_handle_t refused = nullptr;
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &refused, nullptr), GetParam().hashed ? RG_E_DUPLICATE_KEY : 0);
    EXPECT_EQ(refused == nullptr, GetParam().hashed);
}

struct a_select : ::testing::Test, registry_of_tables {
};

TEST_F(a_select, by_a_resource_handle_answers_lookups)
{
    const rg_opaque_handle_t table = make({false, false}, {column("k", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY)});
    kt_resource_handle_t     handles[]{{1, {2, 3, 4, 5}}, {6, {7, 8, 9, 10}}};
    kt_value_t               key{};
    for (kt_resource_handle_t & handle : handles) {
        key.ptr_rsrc_handle = &handle;
        ASSERT_EQ(add_row(table, {{"k", key}}), 0);
    }
    ASSERT_EQ(commit(table), 0);
    rg_opaque_handle_t result = nullptr;
    ASSERT_EQ(rg_select_1(table, nullptr, 0, &result, text("k == $rh"), &handles[1]), 0) << error_text();
    EXPECT_EQ(object_of(result).total_applied_rows, 1u);
    EXPECT_EQ(find_key(result, key), 0);
}

TEST_F(a_select, of_a_damaged_row_is_refused_with_the_column_and_goes_through_without)
{
    const rg_opaque_handle_t table = make(
        {false, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY), column("s", KT_CHAR_PTR), column("n", KT_INT32)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    const kt_pmsg_value_anchor_t bent{5, 0xFFFFFFF0};
    std::memcpy(rg_i_row_slot(slot_of(table, 0).p_applied, 1), &bent, sizeof bent);
    kt_char_ptr_t      s[]{text("s")};
    kt_char_ptr_t      n[]{text("n")};
    rg_opaque_handle_t result = nullptr;
    EXPECT_EQ(rg_select_1(table, s, 1, &result, nullptr), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(result, nullptr);
    EXPECT_EQ(rg_select_1(table, n, 1, &result, nullptr), 0);
    EXPECT_EQ(rg_select_1(table, nullptr, 0, &result, nullptr), 0) << "copied as it is";
    EXPECT_EQ(read_packed(result, 0, "s").rc, RG_E_LIBRARY_CALL);
}

TEST_F(a_select, is_closed_with_its_tree)
{
    const rg_opaque_handle_t table = make({true, false}, {column("id", KT_UINT32, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    rg_opaque_handle_t results[5];
    for (rg_opaque_handle_t & result : results)
        ASSERT_EQ(rg_select_1(table, nullptr, 0, &result, nullptr), 0);
    ASSERT_EQ(rg_close_table_1(results[2]), 0);
    tree.close(); // the rest goes with it
}

// ---- Selected rows ----

TEST_P(selecting_rows, lists_the_fixed_indices_of_those_that_match)
{
    const rg_opaque_handle_t table = make_numbered(7);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(selected(table, nullptr), (ids{0, 1, 2, 3, 4, 5, 6}));
    EXPECT_EQ(selected(table, "s == \"odd\""), (ids{1, 3, 5}));
    EXPECT_EQ(selected(table, "id > 100"), ids{});
    kt_uint32_t   total  = 0;
    kt_uint32_t * p_rows = nullptr;
    ASSERT_EQ(selected_rows(table, "s == $s && n == $i", 0, &total, &p_rows, "even", 0), 0);
    EXPECT_EQ(taken_list(p_rows, total), (ids{0, 6}));
    EXPECT_EQ(selected(table, "6 / n == 3"), (ids{2, 5})) << "a faulting row doesn't match";
}

TEST_P(selecting_rows, lists_nothing_of_an_empty_table_in_an_array_that_is_freed)
{
    const rg_opaque_handle_t table = make_numbered(0);
    EXPECT_EQ(selected(table, nullptr), ids{});
    EXPECT_EQ(selected(table, "id == 1", 1), ids{});
}

TEST_P(selecting_rows, lists_by_visibility_and_judges_by_applied_values)
{
    const rg_opaque_handle_t table = make_numbered(5);
    ASSERT_EQ(commit(table), 0);
    add_numbered(table, 10, 11); // fixed index 5, even
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"s", string("even")}}), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 2, {{"s", string("odd")}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 4), 0);
    EXPECT_EQ(selected(table, nullptr, 0), (ids{0, 1, 2, 3, 4}));
    EXPECT_EQ(selected(table, nullptr, 1), (ids{0, 1, 2, 3, 5}));
    EXPECT_EQ(selected(table, "s == \"even\"", 1), (ids{0, 1, 5}));
    EXPECT_EQ(selected(table, "s == \"even\"", 0), (ids{0, 1}))
        << "an updated row by its uncommitted values, one whose deletion is pending never";
    EXPECT_EQ(selected(table, "s == \"odd\"", 0), (ids{2, 3}));
}

TEST_P(selecting_rows, lists_the_applied_state_of_a_table_that_shows_it)
{
    ASSERT_EQ(setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "", 1), 0);
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE"), 0);
    EXPECT_EQ(selected(table, nullptr, 0), (ids{0, 1}));
}

// Slots where the rows of numbered tables stand that satisfy a condition; their slots are their ids.
template <class Condition> ids ids_below(kt_uint32_t end, Condition condition)
{
    ids result;
    for (kt_uint32_t id = 0; id < end; ++id)
        if (condition(id))
            result.push_back(id);
    return result;
}

TEST_P(selecting_rows, of_any_number_gives_exactly_those_that_match)
{
    const rg_opaque_handle_t table = make_numbered(0);
    kt_uint32_t              rows  = 0;
    for (const kt_uint32_t more : {1u, 62u, 1u, 1u, 62u, 1u, 1u, 64u, 120u}) {
        add_numbered(table, rows, rows + more);
        rows += more;
        ASSERT_EQ(commit(table), 0);
        EXPECT_EQ(selected(table, nullptr), ids_below(rows, [](kt_uint32_t) { return true; }));
        const ids expected = ids_below(rows, [](kt_uint32_t id) { return id % 3 == 1 && id % 2 == 1 && id != 7; });
        const char * const p_criteria = "n == 1 && s like \"od%\" && id not in (7, 8)";
        EXPECT_EQ(selected(table, p_criteria), expected) << rows;
        const rg_opaque_handle_t result = select(table, {}, p_criteria);
        EXPECT_EQ(column_ids(result), expected) << rows;
        EXPECT_EQ(rg_close_table_1(result), 0);
    }
}

TEST_P(selecting_rows, passes_over_holes_wherever_they_are)
{
    constexpr kt_uint32_t    rows  = 300;
    const rg_opaque_handle_t table = make_numbered(rows);
    ASSERT_EQ(commit(table), 0);
    // The first row, the last one, whole stretches of 64 and more, and single ones.
    ASSERT_EQ(rg_delete_rows_1(table, text("id == 0 || id >= 60 && id < 200 || id % 7 == 6 || id == 299")), 0);
    ASSERT_EQ(commit(table), 0);
    const auto is_there = [](kt_uint32_t id) {
        return !(id == 0 || (id >= 60 && id < 200) || id % 7 == 6 || id == 299);
    };
    EXPECT_EQ(selected(table, nullptr), ids_below(rows, is_there));
    EXPECT_EQ(selected(table, "s == \"even\""),
              ids_below(rows, [&](kt_uint32_t id) { return is_there(id) && id % 2 == 0; }));
    const rg_opaque_handle_t result = select(table, {}, "n != 2");
    EXPECT_EQ(column_ids(result), ids_below(rows, [&](kt_uint32_t id) { return is_there(id) && id % 3 != 2; }));

    // And those that are pending: 201 is deleted, 204 updated.
    ASSERT_EQ(rg_delete_rows_1(table, text("id == 201")), 0);
    ASSERT_EQ(set_fields_by_key(table, uint32(204), {{"s", string("odd")}}), 0);
    EXPECT_EQ(selected(table, "s == \"even\" && id > 200", 0),
              ids_below(rows, [&](kt_uint32_t id) { return is_there(id) && id % 2 == 0 && id > 204; }));
    EXPECT_EQ(selected(table, "s == \"odd\" && id >= 200 && id < 206", 0), (ids{203, 204, 205}));
    EXPECT_EQ(selected(table, "id >= 200 && id < 206", 0), (ids{200, 203, 204, 205}));
    EXPECT_EQ(selected(table, nullptr, 1), ids_below(rows, [&](kt_uint32_t id) { return is_there(id) && id != 201; }));
    EXPECT_EQ(selected(table, nullptr, 0), ids_below(rows, is_there));
}

TEST_P(selecting_rows, refuses_wrong_arguments_of_the_list)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    kt_uint32_t   total  = 77;
    kt_uint32_t * p_rows = nullptr;
    EXPECT_EQ(selected_rows(nullptr, nullptr, 0, &total, &p_rows), RG_E_INVALID_HANDLE);
    EXPECT_EQ(selected_rows(table, nullptr, 0, nullptr, &p_rows), RG_E_NULL_POINTER);
    EXPECT_EQ(selected_rows(table, nullptr, 0, &total, nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(selected_rows(table, "$q", 0, &total, &p_rows), RG_E_INVALID_VARIABLE_TYPE);
    EXPECT_EQ(selected_rows(table, "id = = 1", 0, &total, &p_rows), RG_E_LIBRARY_CALL);
    EXPECT_EQ(total, 77u);
    EXPECT_EQ(p_rows, nullptr);
    kt_char_ptr_t criteria = text("id == $i");
    for (unsigned nth = 1;; ++nth) {
        const fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        const auto run = [&](int unused, ...) {
            va_list ap;
            va_start(ap, unused);
            const kt_int32_t rc = rg_get_selected_rows_v_1(table, criteria, ap, 0, &total, &p_rows);
            va_end(ap);
            return rc;
        };
        const kt_int32_t rc = run(0, 1);
        if (!failed_as_asked(call::allocation)) {
            EXPECT_EQ(rc, 0);
            break;
        }
        EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL);
        EXPECT_EQ(p_rows, nullptr);
    }
    EXPECT_EQ(taken_list(p_rows, total), ids{1});
}

// ---- Updated rows ----

TEST_P(selecting_rows, lists_pending_rows_with_the_deleted_behind_the_count)
{
    const rg_opaque_handle_t table = make_numbered(5);
    ASSERT_EQ(commit(table), 0);
    kt_uint32_t   count  = 77;
    kt_uint32_t * p_rows = reinterpret_cast<kt_uint32_t *>(&count);
    ASSERT_EQ(rg_get_updated_rows_1(table, &count, &p_rows), 0);
    EXPECT_EQ(count, 0u);
    EXPECT_EQ(p_rows, nullptr) << "nothing is pending";

    ASSERT_EQ(set_fields_by_fixed_index(table, 3, {{"n", int32(9)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    ASSERT_EQ(rg_get_updated_rows_1(table, &count, &p_rows), 0);
    EXPECT_EQ(count, 1u);
    EXPECT_EQ(taken_list(p_rows, 2), (ids{3, 1}));

    add_numbered(table, 10, 12);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"n", int32(9)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 3), 0);
    ASSERT_EQ(rg_get_updated_rows_1(table, &count, &p_rows), 0);
    EXPECT_EQ(count, 3u);
    EXPECT_EQ(taken_list(p_rows, 5), (ids{5, 6, 0, 1, 3})) << "each list in the order of its changes";

    ASSERT_EQ(rg_abort_1(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(rg_get_updated_rows_1(table, &count, &p_rows), 0);
    EXPECT_EQ(count, 0u);
    EXPECT_EQ(taken_list(p_rows, 1), ids{0});

    EXPECT_EQ(rg_get_updated_rows_1(nullptr, &count, &p_rows), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_get_updated_rows_1(table, nullptr, &p_rows), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_updated_rows_1(table, &count, nullptr), RG_E_NULL_POINTER);
    const fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_get_updated_rows_1(table, &count, &p_rows), RG_E_NO_MEMORY);
}

// ---- Rows of one key ----

struct rows_of_one_key : on_each_kind_of_table {
    static ids duplicates(rg_opaque_handle_t table, kt_value_t key, kt_uint32_t visible)
    {
        kt_uint32_t      count  = 77;
        kt_uint32_t *    p_rows = nullptr;
        const kt_int32_t rc     = rg_get_duplicate_rows_1(table, key, &count, &p_rows, visible);
        if (rc != 0) {
            EXPECT_EQ(rc, RG_E_NO_SUCH_KEY);
            EXPECT_EQ(error_code(), RG_E_NO_SUCH_KEY);
            EXPECT_EQ(error_message_index(), 31);
            EXPECT_EQ(p_rows, nullptr);
            return {};
        }
        return taken_list(p_rows, count);
    }
    ids in_order(ids ascending) const
    {
        if (GetParam().hashed)
            std::reverse(ascending.begin(), ascending.end()); // the newest stands first in its bucket
        return ascending;
    }
};
ON_EACH_KIND_OF_TABLE(rows_of_one_key);

TEST_P(rows_of_one_key, are_all_listed)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("n", KT_INT32)});
    for (kt_uint32_t row = 0; row < 100; ++row)
        ASSERT_EQ(add_row(table, {{"id", uint32(row % 4)}}), 0);
    EXPECT_EQ(duplicates(table, uint32(1), 0), ids{}) << "none is committed";
    ids ascending;
    for (kt_uint32_t row = 1; row < 100; row += 4)
        ascending.push_back(row);
    EXPECT_EQ(duplicates(table, uint32(1), 1), in_order(ascending)) << "25, past the list's first room";
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(duplicates(table, uint32(1), 0), in_order(ascending));
    EXPECT_EQ(duplicates(table, uint32(9), 0), ids{});
}

TEST_P(rows_of_one_key, are_listed_by_the_argument_alone)
{
    ASSERT_EQ(setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "", 1), 0);
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK)});
    ASSERT_EQ(unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE"), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    EXPECT_EQ(duplicates(table, uint32(1), 0), ids{});
    EXPECT_EQ(duplicates(table, uint32(1), 1), ids{0});
}

TEST_P(rows_of_one_key, whose_deletion_is_pending_are_found_without_visibility_only)
{
    const rg_opaque_handle_t table = make({column("name", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"name", string("a")}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(duplicates(table, string("a"), 1), ids{});
    EXPECT_EQ(duplicates(table, string("a"), 0), ids{0});
}

TEST_P(rows_of_one_key, need_arguments)
{
    const rg_opaque_handle_t table  = make({column("name", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    kt_uint32_t              count  = 77;
    kt_uint32_t *            p_rows = nullptr;
    EXPECT_EQ(rg_get_duplicate_rows_1(nullptr, string("a"), &count, &p_rows, 0), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_get_duplicate_rows_1(table, null_value(), &count, &p_rows, 0), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_duplicate_rows_1(table, string("a"), nullptr, &p_rows, 0), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_duplicate_rows_1(table, string("a"), &count, nullptr, 0), RG_E_NULL_POINTER);
    ASSERT_EQ(add_row(table, {{"name", string("a")}}), 0);
    kt_value_t        key = string("a");
    const fault_scope faults;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_get_duplicate_rows_1(table, key, &count, &p_rows, 1), RG_E_NO_MEMORY);
    EXPECT_EQ(p_rows, nullptr);
}

} // namespace

} // namespace kt_test
