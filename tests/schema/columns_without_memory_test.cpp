// SPDX-License-Identifier: MIT
// Column changes and overlays with each allocation made to fail in turn: a code, nothing leaked, and a table and a file
// that are as they were.
#include <optional>

#include "schema/columns_kit.h"
#include "support/faults.h"

namespace kt_test
{

struct changing_columns_without_memory : on_each_table_of_three_rows {
};
ON_EACH_KIND_OF_TABLE(changing_columns_without_memory);

TEST_P(changing_columns_without_memory, leaves_the_table_and_its_file_as_they_were)
{
    for (const column_change & change : all_changes()) {
        SCOPED_TRACE(change.name);
        unsigned nth = 1;
        for (;; ++nth) {
            SCOPED_TRACE(nth);
            const std::string          name    = change.name + std::to_string(nth);
            const rg_opaque_handle_t   table   = filled(explicit_writing, name);
            const table_picture        before  = picture_of(table);
            const kt_uint64_t          counter = object_of(table).change_counter;
            const std::optional<bytes> content = persistent() ? std::optional(read_file(file(name))) : std::nullopt;
            bool                       failed  = false;
            kt_int32_t                 rc      = 0;
            {
                const fault_scope faults;
                fail_call(call::allocation, nth, ENOMEM);
                rc     = change.make(table);
                failed = failed_as_asked(call::allocation);
            }
            if (!failed) {
                EXPECT_EQ(rc, 0);
                break;
            }
            // A value that can't be read or stored for want of memory is a failure of the value library.
            EXPECT_TRUE(rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL) << rc;
            if (is_deletion(change)) {
                EXPECT_EQ(rc, RG_E_NO_MEMORY);
                EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
            } else if (nth == 1) {
                EXPECT_EQ(error_code(), RG_E_NULL_POINTER) << "of the release of a description that wasn't made";
            } else {
                EXPECT_TRUE(error_code() == 0 || error_code() == rc) << error_code();
            }
            EXPECT_EQ(picture_of(table), before);
            EXPECT_EQ(object_of(table).change_counter, counter);
            EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val"}));
            if (content) {
                EXPECT_EQ(to_hex(read_file(file(name))), to_hex(*content));
                EXPECT_FALSE(file_exists(file(name + ".rewrite")));
            }
            EXPECT_EQ(change.make(table), 0);
        }
        EXPECT_GT(nth, 8u);
    }
}

// The room for the exchange is made ahead of the commit: behind it there would be no way back.
TEST(changing_columns_of_a_file, whose_row_index_grows_never_fails_behind_its_commit)
{
    for (unsigned nth = 1;; ++nth) {
        SCOPED_TRACE(nth);
        registry_of_tables r;
        rg_opaque_handle_t table = r.make({false, true}, three_columns(), registry_of_tables::explicit_writing);
        add_rows(table, three_rows());
        ASSERT_EQ(commit(table), 0);
        ASSERT_EQ(rg_close_table_1(table), 0);
        table = open_table(r.tree, "/kept/table", registry_of_tables::explicit_writing);
        ASSERT_LT(object_of(table).maximum_rows, 100u) << "a new table has that many slots";
        const bytes content = read_file(r.directory.file("table"));
        bool        failed  = false;
        kt_int32_t  rc      = 0;
        {
            const fault_scope faults;
            fail_call(call::allocation, nth, ENOMEM);
            rc     = add_columns(table, {column("extra", KT_INT32)});
            failed = failed_as_asked(call::allocation);
        }
        EXPECT_EQ(rc != 0, failed);
        EXPECT_EQ(to_hex(read_file(r.directory.file("table"))) != to_hex(content), rc == 0);
        EXPECT_EQ(rows_in(table), three_rows());
        EXPECT_EQ(object_of(table).total_columns, rc == 0 ? 4u : 3u);
        if (!failed)
            return;
    }
}

TEST(overlaying_a_default, without_memory_changes_nothing)
{
    registry_of_tables       r;
    const rg_opaque_handle_t table = r.make({false, false}, three_columns());
    const fault_scope        faults;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(overlay_default(table, "name", string("abcd")), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    reset_calls();
    EXPECT_EQ(default_string_of(table, "name"), "none");
    EXPECT_EQ(overlay_default(table, "name", string("abcd")), 0);
}

} // namespace kt_test
