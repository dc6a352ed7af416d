// SPDX-License-Identifier: MIT
// Column changes and overlays beside readers in one process.
#include <atomic>
#include <thread>

#include "schema/columns_kit.h"

namespace kt_test
{

TEST(threads_that_read, see_the_columns_ahead_of_a_change_or_behind_it_and_whole_rows)
{
    registry_of_tables       r;
    const rg_opaque_handle_t table = r.make({true, true}, three_columns());
    add_rows(table, three_rows());
    ASSERT_EQ(commit(table), 0);

    std::atomic<bool>        done{false};
    std::vector<std::thread> readers;
    for (int i = 0; i < 2; ++i)
        readers.emplace_back([&] {
            const std::string names[2] = {"none", "abcd"};
            while (!done) {
                EXPECT_EQ(read_key(table, uint32(1), "val").value.val_int64, 10);
                EXPECT_EQ(taken_string(read_key(table, uint32(2), "name")), three_rows()[2].first);
                const reading extra = read_key(table, uint32(3), "extra");
                EXPECT_TRUE(extra.rc == RG_E_INVALID_COLUMN || (extra.rc == 0 && extra.value.val_int32 == 5));
                const description d(table, -1);
                EXPECT_TRUE(d->number_of_columns == 3 || d->number_of_columns == 4);
                const std::string name = d->column_definitions[1].default_value.ptr_char;
                EXPECT_TRUE(name == names[0] || name == names[1]) << name;
            }
        });
    for (int i = 0; i < 50; ++i) {
        EXPECT_EQ(add_columns(table, {column("extra", KT_INT32, RG_STANDARD, int32(5))}), 0);
        EXPECT_EQ(overlay_default(table, "name", string(i % 2 == 0 ? "abcd" : "none")), 0);
        EXPECT_EQ(overlay_qualifier(table, "val", RG_STANDARD | (i % 2 == 0 ? RG_PROTECTED : 0)), 0);
        EXPECT_EQ(delete_columns(table, {"extra"}), 0);
    }
    done = true;
    for (std::thread & reader : readers)
        reader.join();
    EXPECT_EQ(rows_in(table), three_rows());
}

} // namespace kt_test
