// SPDX-License-Identifier: MIT
// The class table, the empty values, and the comparison of resource handles.
#include <gtest/gtest.h>

#include <cstring>

#include "kt_ku.h"

namespace
{

TEST(the_class_table, marks_exactly_types_8_to_22_as_indirect)
{
    for (kt_uint32_t type = 0; type < KU_DTC_TYPES; type++)
        EXPECT_EQ((ku_dtc_table_1[type] & 4) != 0, type >= KT_CHAR_PTR && type <= KT_SD_PTR_ARRAY) << type;
}

TEST(the_empty_values, are_empty)
{
    EXPECT_STREQ(ku_ptr_empty_char_1, "");
    EXPECT_EQ(ku_ptr_empty_binary_1->length, 0u);
    EXPECT_EQ(ku_ptr_empty_sd_1->element_count, 0u);
    EXPECT_EQ(ku_ptr_empty_array_1->element_count, 0u);
    const kt_resource_handle_t zeros = {};
    EXPECT_EQ(std::memcmp(ku_ptr_invld_rsrc_hndl_1, &zeros, sizeof zeros), 0);
}

TEST(the_empty_values, the_array_is_an_empty_byte_string_of_fields_too)
{
    kt_sbs_t sbs;
    std::memcpy(&sbs, ku_ptr_empty_array_1, sizeof sbs);
    EXPECT_EQ(sbs.length, 0);
}

TEST(comparing_resource_handles, the_first_differing_word_decides_by_its_unsigned_value)
{
    kt_resource_handle_t a = {1, {2, 3, 4, 5}};
    for (int word = 0; word < 5; word++) {
        kt_resource_handle_t b = a;
        kt_uint32_t          words[5];
        std::memcpy(words, &b, sizeof b);
        words[word] = 0xFFFFFFFF;
        if (word < 4)
            words[4] = 0;
        std::memcpy(&b, words, sizeof b);
        EXPECT_EQ(ku_rsrc_hndl_cmp_1(&a, &b), -1) << word;
        EXPECT_EQ(ku_rsrc_hndl_cmp_1(&b, &a), 1) << word;
    }
    kt_resource_handle_t same = a;
    EXPECT_EQ(ku_rsrc_hndl_cmp_1(&a, &same), 0);
}

TEST(comparing_resource_handles, works_at_any_alignment)
{
    const kt_resource_handle_t a = {0x01020304, {5, 6, 7, 8}}, b = {0x01020304, {5, 6, 7, 9}};
    for (size_t shift1 = 0; shift1 < 8; shift1++) {
        for (size_t shift2 = 0; shift2 < 8; shift2++) {
            alignas(8) char room1[32], room2[32];
            std::memcpy(room1 + shift1, &a, sizeof a);
            std::memcpy(room2 + shift2, &b, sizeof b);
            EXPECT_EQ(ku_rsrc_hndl_cmp_1(room1 + shift1, room2 + shift2), -1);
            std::memcpy(room2 + shift2, &a, sizeof a);
            EXPECT_EQ(ku_rsrc_hndl_cmp_1(room1 + shift1, room2 + shift2), 0);
        }
    }
}

} // namespace
