// SPDX-License-Identifier: MIT
// Adding, setting and deleting with each allocation made to fail in turn: a code, a true error record, no leak, and a
// table that is as it was and goes on working.
#include <functional>

#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

using table_maker  = std::function<rg_opaque_handle_t(const std::string & name)>;
using table_update = std::function<kt_int32_t(rg_opaque_handle_t)>;

struct running_out_of_memory : on_each_kind_of_table {
    rg_opaque_handle_t make_simple(const std::string & name)
    {
        return registry_of_tables::make(GetParam(), {column("id", KT_UINT32, RG_PRIMARY_KEY), column("s", KT_CHAR_PTR)},
                                        explicit_writing, name);
    }

    // Runs the update on a fresh table with its first allocation failing, on another with the second failing, and so on
    // until it goes through; and after each failure once more on the same table. The update's arguments are made ahead,
    // so that the test's own allocations don't count. Returns how many allocations the update makes.
    unsigned fail_each_allocation(const table_maker & make_table, const table_update & update,
                                  const std::function<void(rg_opaque_handle_t)> & look)
    {
        for (unsigned nth = 1;; ++nth) {
            const rg_opaque_handle_t table  = make_table("t" + std::to_string(nth));
            const table_picture      before = picture_of(table);
            kt_int32_t               rc     = 0;
            bool                     failed = false;
            {
                const fault_scope faults;
                fail_call(call::allocation, nth, ENOMEM);
                rc     = update(table);
                failed = failed_as_asked(call::allocation);
            }
            if (failed) {
                EXPECT_EQ(rc, RG_E_NO_MEMORY) << nth;
                EXPECT_EQ(error_code(), RG_E_NO_MEMORY) << nth;
                EXPECT_EQ(error_message_index(), 3) << nth;
                EXPECT_EQ(picture_of(table), before) << nth;
                EXPECT_TRUE(free_room_is_zero(table)) << nth;
                EXPECT_EQ(update(table), 0) << nth;
            } else {
                EXPECT_EQ(rc, 0);
            }
            look(table);
            EXPECT_EQ(commit(table), 0);
            if (!failed || HasFailure())
                return nth - 1;
        }
    }
};
ON_EACH_KIND_OF_TABLE(running_out_of_memory);

// The arguments of one call, made once.
struct arguments {
    kt_char_ptr_t names[2]{text("id"), text("s")};
    kt_value_t    id{};
    kt_value_t    s{};
    kt_value_t *  values[2]{&id, &s};
};

TEST_P(running_out_of_memory, while_adding_leaves_the_table_as_it_was)
{
    arguments a;
    a.id = uint32(1);
    a.s  = string(std::string(3'000'000, 's')); // more than any room that is there
    const unsigned allocations =
        fail_each_allocation([&](const std::string & name) { return make_simple(name); },
                             [&](rg_opaque_handle_t table) { return rg_add_row_1(table, a.names, a.values, 2); },
                             [&](rg_opaque_handle_t table) { EXPECT_EQ(find_key(table, uint32(1)), 0); });
    EXPECT_GE(allocations, GetParam().hashed ? 3u : 2u) << "room, a hash element and a change entry at least";
}

TEST_P(running_out_of_memory, while_the_index_grows_leaves_the_table_as_it_was)
{
    arguments a;
    a.id                       = uint32(100);
    const unsigned allocations = fail_each_allocation(
        [&](const std::string & name) {
            const rg_opaque_handle_t table = make_simple(name);
            for (kt_uint32_t id = 0; id < 100; ++id)
                EXPECT_EQ(add_row(table, {{"id", uint32(id)}}), 0);
            return table;
        },
        [&](rg_opaque_handle_t table) { return rg_add_row_1(table, a.names, a.values, 2); },
        [&](rg_opaque_handle_t table) { EXPECT_EQ(find_key(table, uint32(100)), 100); });
    EXPECT_EQ(allocations, 2u)
        << "both arrays; the hash element stands in its bucket, and change entries are left over";
}

TEST_P(running_out_of_memory, while_reviving_a_row_leaves_it_deleted)
{
    arguments a;
    a.id                       = uint32(1);
    a.s                        = string(std::string(3'000'000, 's'));
    const unsigned allocations = fail_each_allocation(
        [&](const std::string & name) {
            const rg_opaque_handle_t table = make_simple(name);
            EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
            EXPECT_EQ(commit(table), 0);
            EXPECT_EQ(rg_delete_row_by_index_1(table, 0), 0);
            return table;
        },
        [&](rg_opaque_handle_t table) { return rg_add_row_1(table, a.names, a.values, 2); },
        [&](rg_opaque_handle_t table) { EXPECT_EQ(read_fixed(table, GetParam().hashed ? 0 : 1, "id", 1).rc, 0); });
    EXPECT_GE(allocations, 2u);
}

TEST_P(running_out_of_memory, while_setting_leaves_the_row_as_it_was)
{
    kt_char_ptr_t  name        = text("s");
    kt_value_t     value       = string(std::string(3'000'000, 's'));
    const unsigned allocations = fail_each_allocation(
        [&](const std::string & table_name) {
            const rg_opaque_handle_t table = make_simple(table_name);
            EXPECT_EQ(add_row(table, {{"id", uint32(1)}, {"s", string("before")}}), 0);
            EXPECT_EQ(commit(table), 0);
            return table;
        },
        [&](rg_opaque_handle_t table) { return rg_set_field_by_index_1(table, 0, name, &value); },
        [&](rg_opaque_handle_t table) {
            EXPECT_EQ(taken_string(read_fixed(table, 0, "s")), "before");
            EXPECT_EQ(taken_string(read_fixed(table, 0, "s", 1)).size(), 3'000'000u);
        });
    EXPECT_GE(allocations, 2u) << "room and a change entry";
}

TEST_P(running_out_of_memory, while_deleting_a_committed_row_leaves_it)
{
    const unsigned allocations = fail_each_allocation(
        [&](const std::string & name) {
            const rg_opaque_handle_t table = make_simple(name);
            EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
            EXPECT_EQ(commit(table), 0);
            return table;
        },
        [&](rg_opaque_handle_t table) { return rg_delete_row_by_index_1(table, 0); },
        [&](rg_opaque_handle_t table) {
            EXPECT_EQ(state_of(table, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_DELETED));
        });
    EXPECT_EQ(allocations, 1u) << "a change entry";
}

TEST_P(running_out_of_memory, while_deleting_an_added_row_leaves_it)
{
    const unsigned allocations = fail_each_allocation(
        [&](const std::string & name) {
            const rg_opaque_handle_t table = make_simple(name);
            EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
            return table;
        },
        [&](rg_opaque_handle_t table) { return rg_delete_row_by_index_1(table, 0); },
        [&](rg_opaque_handle_t table) {
            EXPECT_EQ(state_of(table, 0), static_cast<rg_row_state_t>(RG_ROW_STATE_NO_ROW));
        });
    EXPECT_EQ(allocations, GetParam().hashed ? 1u : 0u)
        << "the element's own copy of the key; the row is listed already";
}

TEST_P(running_out_of_memory, for_good_lets_nothing_be_added_and_everything_be_read)
{
    const rg_opaque_handle_t table = make_simple("t");
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(commit(table), 0);
    arguments a;
    a.id               = uint32(2);
    kt_char_ptr_t p_id = text("id");
    kt_value_t    back{};
    {
        const fault_scope faults;
        fail_call(call::allocation, 1, ENOMEM, for_good);
        EXPECT_EQ(rg_add_row_1(table, a.names, a.values, 2), RG_E_NO_MEMORY);
        EXPECT_EQ(rg_get_field_by_key_1(table, uint32(1), p_id, &back), 0);
        EXPECT_EQ(rg_abort_1(table), 0);
    }
    EXPECT_EQ(back.val_uint32, 1u);
    EXPECT_EQ(rg_add_row_1(table, a.names, a.values, 2), 0);
}

} // namespace

} // namespace kt_test
