// SPDX-License-Identifier: MIT
// The texts of the messages, and which message each code carries.
#include <gtest/gtest.h>

#include <nl_types.h>

#include <string>

#include "frame/rg_i_messages.h"
#include "frame/rg_i_trace.h"
#include "support/registry.h"

using namespace kt_test;

namespace
{

constexpr char module_version[] = "messages_test 1.0";

struct expected_message {
    int          index;
    int          code;
    const char * text; // without the newline at the end
};

// Written out once more, independent of the library's list.
// clang-format off
constexpr expected_message EXPECTED[] = {
    {0, 0, "Reserved: DO NOT USE!"},
    {1, 10,
     "2605-010 The %1$s system call unexpectedly returned an errno of %2$d to the %3$s function near line "
     "%4$d of file %5$s, version %6$s."},
    {2, 11,
     "2605-011 The %1$s library function unexpectedly returned %2$d to the %3$s function near line %4$d "
     "of file %5$s, version %6$s."},
    {3, 12, "2605-012 Memory could not be allocated in the %1$s function near line %2$d of file %3$s, version %4$s."},
    {4, 13, "2605-013 The filesystem containing the local tree is full."},
    {5, 14, "2605-014 The table is unreadable."},
    {6, 15,
     "2605-015 An irrecoverable internal inconsistency occurred during the %1$s function near line %2$d "
     "of file %3$s, version %4$s."},
    {7, 100, "2605-100 A function was passed an invalid handle."},
    {8, 101, "2605-101 A function was passed a NULL pointer."},
    {9, 102, "2605-102 %1$s is an invalid pathname."},
    {10, 103, "2605-103 An invalid mode was specified while trying to create or open the table."},
    {11, 104, "2605-104 One or more column names or definitions were expected."},
    {12, 105, "2605-105 A column definition is invalid or a specified column name is not defined to the table."},
    {13, 106, "2605-106 More than one column with the same name was supplied."},
    {14, 107, "2605-107 The key column value was expected."},
    {15, 108,
     "2605-108 A row with the specified key already exists when adding a row or more than one key column "
     "was specified when creating a table."},
    {16, 109,
     "2605-109 An invalid positional/replacement variable type was found in the selection criteria "
     "string: %1$s."},
    {17, 200, "2605-200 The table does not exist."},
    {18, 201, "2605-201 The table already exists."},
    {19, 202, "2605-202 There is no row corresponding to the specified key value."},
    {20, 203, "2605-203 There is no row corresponding to the specified index value."},
    {21, 204, "2605-204 The row corresponding to the specified index has been deleted."},
    {22, 205, "2605-205 There are no rows to delete from the table."},
    {23, 206,
     "2605-206 The calling process does not have sufficient access permission to the persistent files "
     "corresponding to the table, or a write operation was called against a table opened only for read."},
    {24, 207, "2605-207 A mount point containing the path already exists."},
    {25, 208, "2605-208 The specified mount point does not exist."},
    {26, 209, "2605-209 A function requiring a committed table was called on an uncommitted table."},
    {27, 210,
     "2605-210 A function requiring pending table updates to have been applied was called before they "
     "were applied."},
    {28, 211, "2605-211 An attempt to open a table more than once in mutually exclusive modes was made."},
    {29, 212, "2605-212 An attempt was made to update a table that has applied but uncommitted updates."},
    {30, 16, "2605-016 The filesystem containing the local tree is full: mounted(%1$s) mounted_over(%2$s)."},
    {31, 202, "2605-213 There is no row corresponding to the specified key value (%1$s) in table (%2$s)."},
};
// clang-format on

// The code, index and text that reporting a code without arguments leaves.
void expect_report(kt_int32_t code, kt_int32_t index)
{
    EXPECT_EQ(rg_i_fail(RG_HERE, code), code);
    EXPECT_EQ(error_code(), code);
    EXPECT_EQ(error_message_index(), index) << code;
    EXPECT_EQ(error_text(), std::string(EXPECTED[index].text) + "\n");
}

} // namespace

TEST(messages, the_built_in_texts_are_the_documented_ones_and_all_but_the_filler_end_in_a_newline)
{
    ASSERT_EQ(std::size(EXPECTED), 32u);
    EXPECT_STREQ(ku_mesgtbl_kt_rg_set[0], EXPECTED[0].text);
    for (int i = 1; i < 32; ++i)
        EXPECT_EQ(ku_mesgtbl_kt_rg_set[i], std::string(EXPECTED[i].text) + "\n") << i;
}

TEST(messages, the_text_for_a_bad_index_stands_beside_the_table)
{
    EXPECT_STREQ(ku_badid_kt_rg_set, "Bad message id for message set kt_rg_set");
}

TEST(messages, the_catalog_says_what_the_library_says)
{
    const nl_catd catalog = catopen(KT_CATALOG, 0);
    ASSERT_NE(catalog, reinterpret_cast<nl_catd>(-1)) << KT_CATALOG;
    for (int i = 1; i < 32; ++i)
        EXPECT_STREQ(catgets(catalog, 1, i, "missing"), ku_mesgtbl_kt_rg_set[i]) << i;
    EXPECT_STREQ(catgets(catalog, 1, 32, "missing"), "missing");
    EXPECT_STREQ(catgets(catalog, 2, 1, "missing"), "missing");
    EXPECT_EQ(catclose(catalog), 0);
}

TEST(messages, each_code_without_arguments_carries_its_own_message)
{
    int reported = 0;
    for (const expected_message & message : EXPECTED)
        if (message.index != 0 && std::string(message.text).find('%') == std::string::npos) {
            expect_report(message.code, message.index);
            ++reported;
        }
    EXPECT_EQ(reported, 23);
}

TEST(messages, the_three_codes_of_an_unreadable_file_carry_the_text_of_a_missing_key)
{
    for (const kt_int32_t code : {213, 214, 215})
        expect_report(code, 19);
}

TEST(messages, the_text_numbered_213_travels_with_code_202)
{
    trace_key_not_found(text("t"), int32(7), KT_INT32);
    EXPECT_EQ(error_code(), 202);
    EXPECT_EQ(error_message_index(), 31);
    EXPECT_EQ(error_text().substr(0, 8), "2605-213");
}

TEST(messages, the_record_names_the_catalog_and_the_set)
{
    EXPECT_EQ(rg_i_fail(RG_HERE, RG_E_ACCESS), 206);
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    EXPECT_STREQ(record.p_catalog, "kt_rg.cat");
    EXPECT_EQ(record.set, 1);
}
