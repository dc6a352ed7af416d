// SPDX-License-Identifier: MIT
// Reading fields: the three ways to a row, visibility and state, the order of the checks, the values of each type, and
// keys. Damaged records are read too.
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <functional>

#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

// ---- Each of the ten reads of fields ----

enum class row_by { packed_index, fixed_index, key };

// One of the ten calls, in one form. A plain form takes no visibility and delivers no state.
struct read_call {
    const char * p_name;
    row_by       by;
    bool         several;
    bool         with_visibility;
    std::function<kt_int32_t(rg_opaque_handle_t, kt_uint32_t row, kt_char_ptr_t *, kt_value_t **, kt_uint32_t count,
                             kt_uint32_t visible, rg_row_state_t *)>
        run;
};

// The tables of these tests have keys that are their packed and fixed indices plus 1000.
kt_value_t key_of(kt_uint32_t row)
{
    return uint32(row == UINT32_MAX ? 7 : row + 1000);
}

std::vector<read_call> all_read_calls()
{
    const auto i = [](kt_uint32_t row) { return static_cast<kt_int32_t>(row); };
    return {
        {"field_by_index", row_by::packed_index, false, false,
         [=](auto t, auto row, auto n, auto v, auto, auto, auto) {
             return rg_get_field_by_index_1(t, i(row), n[0], v[0]);
         }},
        {"field_by_index_and_visibility", row_by::packed_index, false, true,
         [=](auto t, auto row, auto n, auto v, auto, auto visible, auto p_state) {
             return rg_get_field_by_index_and_visibility_1(t, i(row), n[0], v[0], visible, p_state);
         }},
        {"field_by_fixed_index_and_visibility", row_by::fixed_index, false, true,
         [=](auto t, auto row, auto n, auto v, auto, auto visible, auto p_state) {
             return rg_get_field_by_fixed_index_and_visibility_1(t, i(row), n[0], v[0], visible, p_state);
         }},
        {"field_by_key", row_by::key, false, false,
         [=](auto t, auto row, auto n, auto v, auto, auto, auto) {
             return rg_get_field_by_key_1(t, key_of(row), n[0], v[0]);
         }},
        {"field_by_key_and_visibility", row_by::key, false, true,
         [=](auto t, auto row, auto n, auto v, auto, auto visible, auto p_state) {
             return rg_get_field_by_key_and_visibility_1(t, key_of(row), n[0], v[0], visible, p_state);
         }},
        {"fields_by_index", row_by::packed_index, true, false,
         [=](auto t, auto row, auto n, auto v, auto count, auto, auto) {
             return rg_get_fields_by_index_1(t, i(row), n, v, count);
         }},
        {"fields_by_index_and_visibility", row_by::packed_index, true, true,
         [=](auto t, auto row, auto n, auto v, auto count, auto visible, auto p_state) {
             return rg_get_fields_by_index_and_visibility_1(t, i(row), n, v, count, visible, p_state);
         }},
        {"fields_by_fixed_index_and_visibility", row_by::fixed_index, true, true,
         [=](auto t, auto row, auto n, auto v, auto count, auto visible, auto p_state) {
             return rg_get_fields_by_fixed_index_and_visibility_1(t, i(row), n, v, count, visible, p_state);
         }},
        {"fields_by_key", row_by::key, true, false,
         [=](auto t, auto row, auto n, auto v, auto count, auto, auto) {
             return rg_get_fields_by_key_1(t, key_of(row), n, v, count);
         }},
        {"fields_by_key_and_visibility", row_by::key, true, true,
         [=](auto t, auto row, auto n, auto v, auto count, auto visible, auto p_state) {
             return rg_get_fields_by_key_and_visibility_1(t, key_of(row), n, v, count, visible, p_state);
         }},
    };
}

constexpr rg_row_state_t not_delivered = 99;
constexpr rg_row_state_t committed     = RG_ROW_STATE_COMMITTED;
constexpr rg_row_state_t added         = RG_ROW_STATE_ADDED;
constexpr rg_row_state_t updated       = RG_ROW_STATE_UPDATED;
constexpr rg_row_state_t deleted       = RG_ROW_STATE_DELETED;

struct read_result {
    kt_int32_t     rc;
    kt_value_t     value;
    rg_row_state_t state;
};

read_result run(const read_call & call, rg_opaque_handle_t table, kt_uint32_t row, const std::string & column_name,
                kt_uint32_t visible = 0)
{
    read_result   r{0, uint64(0xDEADDEADDEADDEAD), not_delivered};
    kt_char_ptr_t name    = text(column_name);
    kt_value_t *  p_value = &r.value;
    r.rc                  = call.run(table, row, &name, &p_value, 1, visible, &r.state);
    return r;
}

struct every_read : on_each_kind_of_table {
    rg_opaque_handle_t make_numbered(kt_uint32_t rows, kt_int32_t mode = explicit_writing)
    {
        const rg_opaque_handle_t table =
            make({column("id", KT_UINT32, RG_PRIMARY_KEY), column("n", KT_INT32), column("s", KT_CHAR_PTR)}, mode);
        for (kt_uint32_t row = 0; row < rows; ++row)
            EXPECT_EQ(add_row(table, {{"id", key_of(row)},
                                      {"n", int32(static_cast<std::int32_t>(row) * 10)},
                                      {"s", string("text " + std::to_string(row))}}),
                      0);
        return table;
    }
};
ON_EACH_KIND_OF_TABLE(every_read);

TEST_P(every_read, gives_the_committed_value_and_the_state_of_a_committed_row)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls())
        for (const kt_uint32_t visible : {0u, 1u}) {
            const read_result number = run(call, table, 2, "n", visible);
            EXPECT_EQ(number.rc, 0) << call.p_name;
            EXPECT_EQ(error_code(), 0);
            EXPECT_EQ(number.value.val_int32, 20) << call.p_name;
            EXPECT_EQ(number.state, call.with_visibility ? committed : not_delivered) << call.p_name;
            const read_result words = run(call, table, 1, "s", visible);
            ASSERT_EQ(words.rc, 0) << call.p_name;
            EXPECT_STREQ(words.value.ptr_char, "text 1") << call.p_name;
            std::free(words.value.ptr_char);
        }
}

TEST_P(every_read, gives_a_value_that_outlives_the_table)
{
    const rg_opaque_handle_t table = make_numbered(1, implicit_writing);
    const read_result        words = run(all_read_calls()[0], table, 0, "s");
    tree.close();
    EXPECT_STREQ(words.value.ptr_char, "text 0");
    std::free(words.value.ptr_char);
}

TEST_P(every_read, of_an_added_row_needs_visibility)
{
    const rg_opaque_handle_t table = make_numbered(1);
    for (const read_call & call : all_read_calls()) {
        const read_result hidden = run(call, table, 0, "n", 0);
        EXPECT_EQ(hidden.rc, RG_E_ROW_DELETED) << call.p_name;
        EXPECT_EQ(error_code(), RG_E_ROW_DELETED);
        EXPECT_EQ(error_message_index(), 21);
        EXPECT_EQ(hidden.state, not_delivered);
        EXPECT_EQ(hidden.value.val_uint64, 0xDEADDEADDEADDEADu);
        if (call.with_visibility) {
            const read_result shown = run(call, table, 0, "n", 0x100);
            EXPECT_EQ(shown.rc, 0) << call.p_name;
            EXPECT_EQ(shown.state, added);
        }
    }
}

TEST_P(every_read, of_an_updated_row_gives_the_old_or_the_new_value)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 1, {{"n", int32(11)}}), 0);
    for (const read_call & call : all_read_calls()) {
        const read_result old_value = run(call, table, 1, "n", 0);
        EXPECT_EQ(old_value.value.val_int32, 10) << call.p_name;
        if (!call.with_visibility)
            continue;
        EXPECT_EQ(old_value.state, updated) << "the state is the row's own";
        const read_result new_value = run(call, table, 1, "n", 1);
        EXPECT_EQ(new_value.value.val_int32, 11) << call.p_name;
        EXPECT_EQ(new_value.state, updated);
    }
}

TEST_P(every_read, of_a_deleted_row_gives_the_committed_value_without_visibility_only)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    for (const read_call & call : all_read_calls()) {
        const read_result without = run(call, table, 1, "n", 0);
        EXPECT_EQ(without.rc, 0) << call.p_name;
        EXPECT_EQ(without.value.val_int32, 10);
        EXPECT_EQ(without.state, call.with_visibility ? deleted : not_delivered);
        if (call.with_visibility) {
            EXPECT_EQ(run(call, table, 1, "n", 1).rc, RG_E_ROW_DELETED) << call.p_name;
        }
        EXPECT_EQ(run(call, table, 2, "n").value.val_int32, 20) << "its packed index stays valid until commit";
    }
}

TEST_P(every_read, follows_the_table_that_shows_uncommitted_updates)
{
    ASSERT_EQ(setenv("RG_UNCOMMITTED_UPDATES_VISIBLE", "", 1), 0);
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(unsetenv("RG_UNCOMMITTED_UPDATES_VISIBLE"), 0);
    for (const read_call & call : all_read_calls()) {
        const read_result r = run(call, table, 0, "s", 0);
        ASSERT_EQ(r.rc, 0) << call.p_name;
        std::free(r.value.ptr_char);
        if (call.with_visibility) {
            EXPECT_EQ(r.state, added);
        }
    }
}

TEST_P(every_read, refuses_rows_that_are_not_there)
{
    const rg_opaque_handle_t table = make_numbered(3);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls()) {
        switch (call.by) {
        case row_by::packed_index:
            for (const kt_uint32_t row : {3u, 99u, 100u, 0x80000000u, 0xFFFFFFFFu}) {
                EXPECT_EQ(run(call, table, row, "n").rc, RG_E_NO_SUCH_INDEX) << call.p_name << row;
                EXPECT_EQ(error_message_index(), 20);
                EXPECT_EQ(run(call, table, row, "nothing").rc, RG_E_NO_SUCH_INDEX) << "ahead of the name";
            }
            break;
        case row_by::fixed_index:
            for (const kt_uint32_t row : {3u, 99u}) {
                EXPECT_EQ(run(call, table, row, "n").rc, RG_E_ROW_DELETED) << "a slot that no row has";
                EXPECT_EQ(run(call, table, row, "nothing").rc, call.several ? RG_E_ROW_DELETED : RG_E_INVALID_COLUMN);
            }
            for (const kt_uint32_t row : {100u, 0x80000000u, 0xFFFFFFFFu})
                EXPECT_EQ(run(call, table, row, "nothing").rc, RG_E_NO_SUCH_INDEX) << call.p_name << row;
            break;
        case row_by::key:
            EXPECT_EQ(run(call, table, UINT32_MAX, "nothing").rc, RG_E_NO_SUCH_KEY) << call.p_name;
            EXPECT_EQ(error_code(), RG_E_NO_SUCH_KEY);
            EXPECT_EQ(error_message_index(), 31);
            EXPECT_EQ(error_text().substr(0, 8), "2605-213") << "the message's number isn't the code's";
            EXPECT_NE(error_text().find("(7)"), std::string::npos);
            EXPECT_NE(error_text().find(std::string("(") + object_of(table).p_name + ")"), std::string::npos);
            break;
        }
    }
}

TEST_P(every_read, refuses_a_column_that_is_not_there)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls())
        for (const char * p_name : {"", "N", "n ", "nn", "sid"}) {
            EXPECT_EQ(run(call, table, 0, p_name).rc, RG_E_INVALID_COLUMN) << call.p_name;
            EXPECT_EQ(error_message_index(), 12);
        }
}

TEST_P(every_read, of_one_field_tells_a_wrong_name_ahead_of_a_deleted_row_and_of_several_behind_it)
{
    const rg_opaque_handle_t table = make_numbered(1);
    for (const read_call & call : all_read_calls())
        EXPECT_EQ(run(call, table, 0, "nothing").rc, call.several ? RG_E_ROW_DELETED : RG_E_INVALID_COLUMN)
            << call.p_name;
}

TEST_P(every_read, refuses_null_arguments_and_changes_nothing)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls()) {
        kt_value_t     value   = uint32(77);
        kt_value_t *   p_value = &value;
        kt_value_t *   p_none  = nullptr;
        kt_char_ptr_t  name    = text("n");
        kt_char_ptr_t  no_name = nullptr;
        rg_row_state_t state   = not_delivered;
        EXPECT_EQ(call.run(nullptr, 0, &name, &p_value, 1, 0, &state), RG_E_INVALID_HANDLE) << call.p_name;
        EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
        EXPECT_EQ(call.run(table, 0, &no_name, &p_value, 1, 0, &state), RG_E_NULL_POINTER) << call.p_name;
        EXPECT_EQ(call.run(table, 0, &name, &p_none, 1, 0, &state), RG_E_NULL_POINTER) << call.p_name;
        EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
        if (call.several) {
            EXPECT_EQ(call.run(table, 0, nullptr, &p_value, 1, 0, &state), RG_E_NULL_POINTER) << call.p_name;
            EXPECT_EQ(call.run(table, 0, &name, nullptr, 1, 0, &state), RG_E_NULL_POINTER) << call.p_name;
            kt_char_ptr_t names[]{text("n"), nullptr};
            kt_value_t *  values[]{&value, &value};
            EXPECT_EQ(call.run(table, 0, names, values, 2, 0, &state), RG_E_NULL_POINTER) << call.p_name;
        }
        EXPECT_EQ(value.val_uint32, 77u);
        EXPECT_EQ(state, not_delivered);
        EXPECT_EQ(call.run(table, 0, &name, &p_value, 1, 0, nullptr), 0) << "the state needn't be asked for";
    }
}

TEST_P(every_read, of_several_fields_delivers_them_in_the_callers_order_up_to_the_first_failure)
{
    const rg_opaque_handle_t table = make_numbered(2);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls()) {
        if (!call.several)
            continue;
        kt_value_t     values[4]{uint64(1), uint64(2), uint64(3), uint64(4)};
        kt_value_t *   pointers[]{&values[0], &values[1], &values[2], &values[3]};
        kt_char_ptr_t  names[]{text("s"), text("id"), text("n"), text("s")};
        rg_row_state_t state = not_delivered;
        ASSERT_EQ(call.run(table, 1, names, pointers, 4, 0, &state), 0);
        EXPECT_STREQ(values[0].ptr_char, "text 1");
        EXPECT_EQ(values[1].val_uint32, 1001u);
        EXPECT_EQ(values[2].val_int32, 10);
        EXPECT_STREQ(values[3].ptr_char, "text 1") << "a name may stand twice";
        std::free(values[0].ptr_char);
        std::free(values[3].ptr_char);

        kt_char_ptr_t wrong[]{text("s"), text("n"), text("nothing"), text("n")};
        values[2] = values[3] = uint64(5);
        state                 = not_delivered;
        EXPECT_EQ(call.run(table, 1, wrong, pointers, 4, 0, &state), RG_E_INVALID_COLUMN);
        EXPECT_STREQ(values[0].ptr_char, "text 1") << "delivered ahead of the failure, and the caller's to free";
        EXPECT_EQ(values[1].val_int32, 10);
        EXPECT_EQ(values[2].val_uint64, 5u);
        EXPECT_EQ(values[3].val_uint64, 5u);
        EXPECT_EQ(state, not_delivered);
        std::free(values[0].ptr_char);
    }
}

TEST_P(every_read, of_no_fields_looks_at_the_row_and_delivers_its_state)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls()) {
        if (!call.several)
            continue;
        rg_row_state_t state = not_delivered;
        EXPECT_EQ(call.run(table, 0, nullptr, nullptr, 0, 0, &state), 0) << call.p_name;
        EXPECT_EQ(state, call.with_visibility ? committed : not_delivered);
        EXPECT_NE(call.run(table, call.by == row_by::key ? UINT32_MAX : 5000, nullptr, nullptr, 0, 0, &state), 0);
    }
}

TEST_P(every_read, works_in_a_forked_child)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    const pid_t child = fork();
    if (child == 0) {
        for (const read_call & call : all_read_calls())
            if (run(call, table, 0, "n").rc != 0)
                _exit(1);
        _exit(0);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST_P(every_read, fails_with_a_code_when_memory_runs_out)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    const fault_scope faults;
    for (const read_call & call : all_read_calls()) {
        kt_value_t    value   = uint32(77);
        kt_value_t *  p_value = &value;
        kt_char_ptr_t name    = text("s");
        fail_call(call::allocation, 1, ENOMEM);
        EXPECT_EQ(call.run(table, 0, &name, &p_value, 1, 0, nullptr), RG_E_LIBRARY_CALL) << call.p_name;
        EXPECT_TRUE(failed_as_asked(call::allocation));
        EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
        EXPECT_NE(error_text().find("kt_pmsg_build_conv_packed_client_value"), std::string::npos);
        EXPECT_EQ(value.val_uint32, 77u);
    }
}

TEST_P(every_read, of_a_number_allocates_nothing)
{
    const rg_opaque_handle_t table = make_numbered(1);
    ASSERT_EQ(commit(table), 0);
    const std::vector<read_call> calls = all_read_calls();
    kt_value_t                   value{};
    kt_value_t *                 p_value = &value;
    kt_char_ptr_t                name    = text("n");
    const fault_scope            faults;
    for (const read_call & call : calls)
        ASSERT_EQ(call.run(table, 0, &name, &p_value, 1, 0, nullptr), 0);
    EXPECT_EQ(calls_made(call::allocation), 0u);
}

TEST_P(every_read, takes_invisible_and_protected_columns_like_any_other)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY | RG_INVISIBLE),
                                           column("n", KT_INT32, RG_STANDARD | RG_INVISIBLE | RG_PROTECTED)});
    ASSERT_EQ(add_row(table, {{"id", key_of(0)}, {"n", int32(3)}}), 0);
    ASSERT_EQ(commit(table), 0);
    for (const read_call & call : all_read_calls())
        EXPECT_EQ(run(call, table, 0, "n").value.val_int32, 3) << call.p_name;
}

// ---- The twelfth way: where is the key ----

struct finding_a_key : on_each_kind_of_table {
};
ON_EACH_KIND_OF_TABLE(finding_a_key);

TEST_P(finding_a_key, gives_the_fixed_index)
{
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY)});
    for (kt_uint32_t id : {5u, 3u, 9u})
        ASSERT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
    EXPECT_EQ(find_key(table, uint32(9)), 2) << "an added row is found";
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, uint32(3)), 1);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 1), 0);
    EXPECT_EQ(find_key(table, uint32(3)), 1) << "a row whose deletion is pending is found";
    EXPECT_EQ(find_key(table, uint32(4)), -RG_E_NO_SUCH_KEY);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(find_key(table, uint32(3)), -RG_E_NO_SUCH_KEY);
}

TEST_P(finding_a_key, refuses_null_arguments)
{
    const rg_opaque_handle_t table = make({column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"s", string("")}}), 0);
    kt_uint32_t fixed_index = 77;
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(nullptr, string("a"), &fixed_index), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, string("a"), nullptr), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, null_value(), &fixed_index), RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(rg_get_fixed_row_index_for_key_1(table, string("a"), &fixed_index), RG_E_NO_SUCH_KEY);
    EXPECT_EQ(fixed_index, 77u);
}

TEST_P(finding_a_key, shows_the_key_in_the_message)
{
    const rg_opaque_handle_t table = make({column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)});
    EXPECT_EQ(find_key(table, string(std::string(300, 'k'))), -RG_E_NO_SUCH_KEY);
    EXPECT_NE(error_text().find("(" + std::string(255, 'k') + ")"), std::string::npos);
}

TEST_P(finding_a_key, that_was_changed_finds_the_row_as_its_record_stands)
{
    // Keys 1 and 1 + 1024 * n may share a bucket or not; without a hash table the committed record alone counts.
    const rg_opaque_handle_t table = make({column("id", KT_UINT32, RG_PRIMARY_KEY)});
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"id", uint32(2)}}), 0);
    EXPECT_EQ(find_key(table, uint32(1)), 0) << "an updated row is found under its committed key";
    EXPECT_EQ(find_key(table, uint32(2)), -RG_E_NO_SUCH_KEY);
}

// ---- Values of each type ----

struct values_of_each_type : ::testing::Test, registry_of_tables {
    // What comes back for a value that was stored.
    kt_value_t there_and_back(kt_data_type_t type, kt_value_t value)
    {
        static int               count = 0;
        const rg_opaque_handle_t table =
            make({false, false}, {column("k", KT_INT32, RG_PRIMARY_KEY), column("v", type)}, implicit_writing,
                 "values_" + std::to_string(count++));
        EXPECT_EQ(add_row(table, {{"k", int32(1)}, {"v", value}}), 0);
        const reading r = read_key(table, int32(1), "v");
        EXPECT_EQ(r.rc, 0) << type;
        return r.value;
    }
};

TEST_F(values_of_each_type, are_the_same_bits_for_numbers)
{
    for (const kt_data_type_t type : {KT_INT32, KT_UINT32, KT_INT64, KT_UINT64, KT_FLOAT32, KT_FLOAT64})
        EXPECT_EQ(there_and_back(type, uint64(0x8877665544332211)).val_uint64, 0x8877665544332211u) << type;
    EXPECT_TRUE(std::isnan(there_and_back(KT_FLOAT64, float64(NAN)).val_float64));
}

TEST_F(values_of_each_type, are_copies_for_strings_binaries_and_handles)
{
    kt_value_t back = there_and_back(KT_CHAR_PTR, string("a string"));
    EXPECT_STREQ(back.ptr_char, "a string");
    std::free(back.ptr_char);

    alignas(kt_binary_t) char room[sizeof(kt_binary_t) + 8];
    auto * const              p_binary = reinterpret_cast<kt_binary_t *>(room);
    p_binary->length                   = 5;
    std::memcpy(room + offsetof(kt_binary_t, data), "\x00\x01\xff\x80\x00", 5);
    kt_value_t value{};
    value.ptr_binary = p_binary;
    back             = there_and_back(KT_BINARY_PTR, value);
    ASSERT_EQ(back.ptr_binary->length, 5u);
    EXPECT_EQ(std::memcmp(back.ptr_binary->data, "\x00\x01\xff\x80\x00", 5), 0);
    std::free(back.ptr_binary);

    kt_resource_handle_t handle{0x12345678, {1, 2, 3, 4}};
    value.ptr_rsrc_handle = &handle;
    back                  = there_and_back(KT_RSRC_HANDLE_PTR, value);
    EXPECT_EQ(ku_rsrc_hndl_cmp_1(back.ptr_rsrc_handle, &handle), 0);
    std::free(back.ptr_rsrc_handle);
}

TEST_F(values_of_each_type, are_copies_for_arrays_of_numbers_and_of_strings)
{
    alignas(kt_array_t) char room[sizeof(kt_array_t) + 8];
    auto * const             p_array = reinterpret_cast<kt_array_t *>(room);
    p_array->element_count           = 2;
    p_array->pad                     = 0;
    p_array->elements[0]             = int64(-5);
    std::memcpy(room + sizeof(kt_array_t), &(const kt_value_t &)int64(6), sizeof(kt_value_t));
    kt_value_t value{};
    value.ptr_array = p_array;
    kt_value_t back = there_and_back(KT_INT64_ARRAY, value);
    ASSERT_EQ(back.ptr_array->element_count, 2u);
    EXPECT_EQ(back.ptr_array->elements[0].val_int64, -5);
    kt_value_t second;
    std::memcpy(&second, reinterpret_cast<const char *>(back.ptr_array) + sizeof(kt_array_t), sizeof second);
    EXPECT_EQ(second.val_int64, 6);
    std::free(back.ptr_array);

    p_array->element_count = 1;
    p_array->elements[0]   = string("inside");
    back                   = there_and_back(KT_CHAR_PTR_ARRAY, value);
    EXPECT_STREQ(back.ptr_array->elements[0].ptr_char, "inside");
    std::free(back.ptr_array);
}

TEST_F(values_of_each_type, are_the_empty_value_for_a_null_pointer)
{
    for (kt_data_type_t type = KT_CHAR_PTR; type <= static_cast<kt_data_type_t>(KT_SD_PTR_ARRAY); ++type) {
        if (type == static_cast<kt_data_type_t>(KT_SD_PTR) || type == static_cast<kt_data_type_t>(KT_SD_PTR_ARRAY))
            continue; // these need a definition; below
        const kt_value_t back = there_and_back(type, null_value());
        ASSERT_NE(back.ptr_char, nullptr) << type;
        if (type == static_cast<kt_data_type_t>(KT_RSRC_HANDLE_PTR)) {
            EXPECT_EQ(ku_rsrc_hndl_cmp_1(back.ptr_rsrc_handle, ku_ptr_invld_rsrc_hndl_1), 0);
        } else if (type == static_cast<kt_data_type_t>(KT_CHAR_PTR)) {
            EXPECT_STREQ(back.ptr_char, "");
        } else {
            EXPECT_EQ(rg_i_load_u32(back.ptr_char), 0u) << type; // a length or a count
        }
        std::free(back.ptr_char);
    }
}

TEST_F(values_of_each_type, are_copies_for_structured_data)
{
    rg_sd_def_t definition{1, {{KT_CHAR_PTR, text("field")}}};
    rg_column_t sd_column    = column("v", KT_SD_PTR, RG_STANDARD, null_value());
    sd_column.sd_defn        = &definition;
    rg_column_t array_column = column("w", KT_SD_PTR_ARRAY, RG_STANDARD, null_value());
    array_column.sd_defn     = &definition;
    const rg_opaque_handle_t t =
        make({false, false}, {column("k", KT_INT32, RG_PRIMARY_KEY), sd_column, array_column}, implicit_writing);
    kt_structured_data_t sd{1, 0, {{KT_CHAR_PTR, 0, string("in a field")}}};
    kt_value_t           value{};
    value.ptr_sd = &sd;
    kt_array_t array{1, 0, {value}};
    kt_value_t array_value{};
    array_value.ptr_array = &array;
    ASSERT_EQ(add_row(t, {{"k", int32(1)}, {"v", value}, {"w", array_value}}), 0);
    ASSERT_EQ(add_row(t, {{"k", int32(2)}}), 0);
    reading r = read_key(t, int32(1), "v");
    ASSERT_EQ(r.rc, 0);
    EXPECT_STREQ(r.value.ptr_sd->elements[0].value.ptr_char, "in a field");
    std::free(r.value.ptr_sd);
    r = read_key(t, int32(1), "w");
    ASSERT_EQ(r.rc, 0);
    EXPECT_STREQ(r.value.ptr_array->elements[0].ptr_sd->elements[0].value.ptr_char, "in a field");
    std::free(r.value.ptr_array);
    for (const char * p_name : {"v", "w"}) {
        r = read_key(t, int32(2), p_name);
        ASSERT_EQ(r.rc, 0);
        EXPECT_EQ(rg_i_load_u32(r.value.ptr_char), 0u);
        std::free(r.value.ptr_char);
    }
}

// ---- Comparing ----

kt_int32_t compare(kt_value_t client, kt_value_t stored, kt_data_type_t type)
{
    kt_pmsg_value_t slot;
    std::memcpy(&slot, &stored, sizeof slot);
    return rg_i_compare_values(&client, &slot, type, nullptr);
}

TEST(comparing_a_value_with_a_stored_one, is_signed_or_unsigned_on_the_width_of_the_type)
{
    EXPECT_EQ(compare(int32(-1), int32(1), KT_INT32), -1);
    EXPECT_EQ(compare(int32(1), int32(-1), KT_INT32), 1);
    EXPECT_EQ(compare(int32(-1), uint64(0x5555555500000000 | 0xFFFFFFFF), KT_INT32), 0);
    EXPECT_EQ(compare(int32(-1), int32(1), KT_UINT32), 1);
    EXPECT_EQ(compare(int64(-1), int64(1), KT_INT64), -1);
    EXPECT_EQ(compare(int64(-1), int64(1), KT_UINT64), 1);
    EXPECT_EQ(compare(uint64(5), uint64(5), KT_UINT64), 0);
}

TEST(comparing_a_value_with_a_stored_one, finds_a_nan_on_either_side_equal_to_anything)
{
    EXPECT_EQ(compare(float64(1), float64(2), KT_FLOAT64), -1);
    EXPECT_EQ(compare(float64(2), float64(1), KT_FLOAT64), 1);
    EXPECT_EQ(compare(float64(NAN), float64(1), KT_FLOAT64), 0);
    EXPECT_EQ(compare(float64(1), float64(NAN), KT_FLOAT64), 0);
    EXPECT_EQ(compare(float32(NAN), float32(1), KT_FLOAT32), 0);
    EXPECT_EQ(compare(float32(1), float32(2), KT_FLOAT32), -1);
    EXPECT_EQ(compare(float64(0.0), float64(-0.0), KT_FLOAT64), 0);
}

TEST(comparing_a_value_with_a_stored_one, orders_strings_and_handles)
{
    char            indirect[]{"xxbbb\0\x01\0\0\0\x02\0\0\0\x03\0\0\0\x04\0\0\0\x05\0\0\0"};
    kt_pmsg_value_t slot{};
    slot.val_anchor   = {2, 4};
    kt_value_t client = string("abc");
    EXPECT_LT(rg_i_compare_values(&client, &slot, KT_CHAR_PTR, indirect), 0);
    client = string("bbb");
    EXPECT_EQ(rg_i_compare_values(&client, &slot, KT_CHAR_PTR, indirect), 0);
    client = string("bbbb");
    EXPECT_GT(rg_i_compare_values(&client, &slot, KT_CHAR_PTR, indirect), 0);
    client = null_value();
    EXPECT_LT(rg_i_compare_values(&client, &slot, KT_CHAR_PTR, indirect), 0) << "NULL is the empty string";
    kt_resource_handle_t handle{1, {2, 3, 4, 5}};
    client.ptr_rsrc_handle = &handle;
    slot.val_anchor        = {6, 20};
    EXPECT_EQ(rg_i_compare_values(&client, &slot, KT_RSRC_HANDLE_PTR, indirect), 0);
    handle.id.id4 = 6;
    EXPECT_NE(rg_i_compare_values(&client, &slot, KT_RSRC_HANDLE_PTR, indirect), 0);
}

TEST(comparing_a_value_with_a_stored_one, finds_types_that_are_no_key_types_never_equal)
{
    for (const kt_data_type_t type : {KT_UNKNOWN, KT_NONE, KT_BINARY_PTR, KT_SD_PTR, KT_INT32_ARRAY, KT_SD_PTR_ARRAY})
        EXPECT_EQ(compare(uint64(0), uint64(0), type), -1) << type;
    EXPECT_EQ(compare(uint64(0), uint64(0), 23), -1);
}

TEST(comparing_a_value_with_a_stored_one, finds_a_stored_value_that_leads_outside_never_equal)
{
    // Exactly as long as told, so that a look behind it is seen.
    const std::unique_ptr<char[]> indirect(new char[4]{'a', 'b', 'c', '\0'});
    const kt_value_t              client = string("abc");
    const auto                    equal  = [&](kt_uint32_t offset, kt_uint32_t length) {
        kt_pmsg_value_t slot{};
        slot.val_anchor = {offset, length};
        return rg_i_compare_values_within(&client, &slot, KT_CHAR_PTR, indirect.get(), 4) == 0;
    };
    EXPECT_TRUE(equal(0, 4));
    EXPECT_FALSE(equal(0, 3)) << "not terminated";
    EXPECT_FALSE(equal(0, 0));
    EXPECT_FALSE(equal(0, 5));
    EXPECT_FALSE(equal(4, 0));
    EXPECT_FALSE(equal(5, 0));
    EXPECT_FALSE(equal(1, 4));
    EXPECT_FALSE(equal(0xFFFFFFFF, 5));
    EXPECT_FALSE(equal(4, 0xFFFFFFFC));
    kt_pmsg_value_t slot{};
    slot.val_anchor = {0, 4};
    kt_resource_handle_t handle{};
    kt_value_t           key{};
    key.ptr_rsrc_handle = &handle;
    EXPECT_NE(rg_i_compare_values_within(&key, &slot, KT_RSRC_HANDLE_PTR, indirect.get(), 4), 0) << "20 bytes it isn't";
}

// ---- Encodings ----

// A tree's conversion handles are made from the process's locale. Here they are made for Latin-1, whatever locales the
// machine has.
void speak_latin_1(rg_opaque_handle_t tree)
{
    auto & object = *static_cast<rg_i_tree_t *>(tree);
    ASSERT_EQ(ku_iconv_close_1(object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_close_1(object.p_from_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_TO_TABLE, &object.p_to_table_string_conversion_handle), 0);
    ASSERT_EQ(ku_iconv_open_1("ISO-8859-1", KU_ICONV_FROM_TABLE, &object.p_from_table_string_conversion_handle), 0);
}

TEST(a_client_of_another_code_set, compares_its_key_unconverted_and_can_miss)
{
    open_tree tree;
    speak_latin_1(tree);
    const rg_opaque_handle_t table =
        create_table(tree, "/t", {column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)}, registry_of_tables::implicit_writing);
    const kt_value_t key = string("\xe4");
    ASSERT_EQ(add_row(table, {{"s", key}}), 0);
    EXPECT_EQ(find_key(table, key), -RG_E_NO_SUCH_KEY) << "stored as UTF-8, looked for as Latin-1";
    EXPECT_EQ(find_key(table, string("\xc3\xa4")), 0);
    EXPECT_EQ(taken_string(read_packed(table, 0, "s")), "\xe4") << "the value comes back converted";
    EXPECT_EQ(add_row(table, {{"s", key}}), 0) << "nor does adding find the equal key without a hash table";
}

TEST(a_client_of_another_code_set, cannot_read_what_its_code_set_lacks)
{
    open_tree                tree;
    const rg_opaque_handle_t table =
        create_table(tree, "/t", {column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)}, registry_of_tables::implicit_writing);
    ASSERT_EQ(add_row(table, {{"s", string("\xe2\x82\xac")}}), 0);
    speak_latin_1(tree);
    EXPECT_EQ(read_packed(table, 0, "s").rc, RG_E_LIBRARY_CALL);
    EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
}

TEST(a_client_of_another_code_set, hashes_the_key_as_it_is_stored)
{
    open_tree tree;
    speak_latin_1(tree);
    const rg_opaque_handle_t table = create_hashed_table(tree, "/t", {column("s", KT_CHAR_PTR, RG_PRIMARY_KEY)},
                                                         registry_of_tables::implicit_writing);
    ASSERT_EQ(add_row(table, {{"s", string("\xe4")}}), 0);
    EXPECT_EQ(add_row(table, {{"s", string("\xe4")}}), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(find_key(table, string("\xe4")), -RG_E_NO_SUCH_KEY);
    EXPECT_EQ(find_key(table, string("\xc3\xa4")), 0);
}

// ---- Damaged records ----

struct a_damaged_record : ::testing::Test, registry_of_tables {
    // A committed row whose anchors are then bent as a broken file would have them.
    rg_opaque_handle_t make_row(bool hashed, kt_data_type_t key_type = KT_UINT32)
    {
        const bool               by_string = key_type == static_cast<kt_data_type_t>(KT_CHAR_PTR);
        const rg_opaque_handle_t table     = make({hashed, false}, {column("k", key_type, RG_PRIMARY_KEY),
                                                                    column("s", KT_CHAR_PTR), column("b", KT_BINARY_PTR)});
        EXPECT_EQ(add_row(table, {{"k", by_string ? string("key") : uint32(1)}, {"s", string("some text")}}), 0);
        EXPECT_EQ(commit(table), 0);
        return table;
    }
    static void bend_anchor(rg_opaque_handle_t table, kt_uint32_t column_index, kt_uint32_t offset, kt_uint32_t length)
    {
        const kt_pmsg_value_anchor_t anchor{offset, length};
        std::memcpy(rg_i_row_slot(slot_of(table, 0).p_applied, column_index), &anchor, sizeof anchor);
    }
    static std::vector<kt_pmsg_value_anchor_t> bent_anchors()
    {
        std::vector<kt_pmsg_value_anchor_t> anchors;
        for (const kt_uint32_t offset : {0u, 1u, 13u, 14u, 15u, 100u, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu})
            for (const kt_uint32_t length : {0u, 1u, 10u, 14u, 15u, 100u, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu})
                anchors.push_back({offset, length});
        return anchors;
    }
};

TEST_F(a_damaged_record, is_read_within_its_bounds_or_refused)
{
    const rg_opaque_handle_t table = make_row(false);
    for (const kt_pmsg_value_anchor_t & anchor : bent_anchors())
        for (const char * p_name : {"s", "b"}) {
            bend_anchor(table, *p_name == 's' ? 1 : 2, anchor.offset, anchor.length);
            const reading r = read_packed(table, 0, p_name);
            EXPECT_TRUE(r.rc == 0 || r.rc == RG_E_LIBRARY_CALL) << anchor.offset << " " << anchor.length;
            EXPECT_EQ(error_code(), r.rc);
            const kt_uint32_t indirect_length =
                rg_i_row_indirect_length(&object_of(table), slot_of(table, 0).p_applied);
            if (std::uint64_t{anchor.offset} + anchor.length > indirect_length) {
                EXPECT_EQ(r.rc, RG_E_LIBRARY_CALL) << anchor.offset << " " << anchor.length;
            }
            if (r.rc == 0)
                std::free(r.value.ptr_char);
        }
}

TEST_F(a_damaged_record, is_found_by_no_key)
{
    const rg_opaque_handle_t table = make_row(false, KT_CHAR_PTR);
    for (const kt_pmsg_value_anchor_t & anchor : bent_anchors()) {
        bend_anchor(table, 0, anchor.offset, anchor.length);
        const std::int64_t found = find_key(table, string("key"));
        EXPECT_TRUE(found == -RG_E_NO_SUCH_KEY || (found == 0 && anchor.offset == 0)) << found;
    }
}

TEST_F(a_damaged_record, lets_other_rows_be_added_beside_it)
{
    const rg_opaque_handle_t table = make_row(false, KT_CHAR_PTR);
    bend_anchor(table, 0, 0xFFFFFFF0, 0x20);
    EXPECT_EQ(add_row(table, {{"k", string("key")}}), 0) << "the damaged key equals nothing";
    EXPECT_EQ(find_key(table, string("key")), 1);
}

TEST_F(a_damaged_record, can_be_mended_by_setting_the_damaged_field_and_is_refused_otherwise)
{
    const rg_opaque_handle_t table = make_row(false);
    bend_anchor(table, 1, 0, 0xFFFFFFFF);
    const table_picture before = picture_of(table);
    EXPECT_EQ(set_fields_by_fixed_index(table, 0, {{"b", null_value()}}), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_TRUE(free_room_is_zero(table));
    ASSERT_EQ(set_fields_by_fixed_index(table, 0, {{"s", string("mended")}}), 0);
    EXPECT_EQ(taken_string(read_packed(table, 0, "s", 1)), "mended");
}

} // namespace

} // namespace kt_test
