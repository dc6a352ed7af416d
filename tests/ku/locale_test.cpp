// SPDX-License-Identifier: MIT
// What the process's locale is.
#include <gtest/gtest.h>

#include <langinfo.h>
#include <locale.h>

#include <cerrno>
#include <string>

#include "kt_ku.h"
#include "support/faults.h"

namespace
{

struct locale_info {
    kt_uint32_t     category_count = 0, item_count = 0;
    kt_int32_t *    p_category_list = nullptr, *p_item_list = nullptr;
    kt_char_ptr_t * p_category_locales = nullptr;
    kt_char_ptr_t * p_item_langinfo    = nullptr;
    kt_char_ptr_t   p_codeset          = nullptr;

    kt_int32_t get()
    {
        return ku_get_locale_info_1(&category_count, &p_category_list, &p_category_locales, &item_count, &p_item_list,
                                    &p_item_langinfo, &p_codeset);
    }
    void release()
    {
        ku_rel_locale_info_1(p_category_list, p_category_locales, p_item_list, p_item_langinfo, p_codeset);
    }
    bool is_empty() const
    {
        return p_category_list == nullptr && p_category_locales == nullptr && p_item_list == nullptr &&
               p_item_langinfo == nullptr && p_codeset == nullptr;
    }
};

TEST(the_locale, delivers_its_code_set_alone_if_nothing_else_is_asked_for)
{
    locale_info info;
    ASSERT_EQ(info.get(), 0);
    EXPECT_STREQ(info.p_codeset, nl_langinfo(CODESET));
    EXPECT_EQ(info.p_category_list, nullptr);
    EXPECT_EQ(info.p_category_locales, nullptr);
    EXPECT_EQ(info.p_item_list, nullptr);
    EXPECT_EQ(info.p_item_langinfo, nullptr);
    info.release();
}

TEST(the_locale, follows_setlocale)
{
    ASSERT_NE(setlocale(LC_CTYPE, "C.UTF-8"), nullptr);
    locale_info info;
    ASSERT_EQ(info.get(), 0);
    EXPECT_STREQ(info.p_codeset, "UTF-8");
    info.release();
    setlocale(LC_CTYPE, "C");
    ASSERT_EQ(info.get(), 0);
    EXPECT_STREQ(info.p_codeset, "ANSI_X3.4-1968");
    info.release();
}

TEST(the_locale, delivers_the_categories_and_items_asked_for_and_leaves_the_callers_arrays)
{
    kt_int32_t  categories[] = {LC_TIME, LC_NUMERIC};
    kt_int32_t  items[]      = {RADIXCHAR, DAY_1, MON_12};
    locale_info info;
    info.category_count  = 2;
    info.p_category_list = categories;
    info.item_count      = 3;
    info.p_item_list     = items;
    ASSERT_EQ(info.get(), 0);
    EXPECT_NE(info.p_category_list, categories);
    EXPECT_EQ(info.p_category_list[1], LC_NUMERIC);
    EXPECT_STREQ(info.p_category_locales[0], "C");
    EXPECT_STREQ(info.p_category_locales[1], "C");
    EXPECT_NE(info.p_item_list, items);
    EXPECT_EQ(info.p_item_list[2], MON_12);
    EXPECT_STREQ(info.p_item_langinfo[0], ".");
    EXPECT_STREQ(info.p_item_langinfo[1], "Sunday");
    EXPECT_STREQ(info.p_item_langinfo[2], "December");
    info.release();
}

TEST(the_locale, delivers_nothing_for_a_category_that_does_not_exist)
{
    kt_int32_t  categories[] = {LC_TIME, 4711};
    locale_info info;
    info.category_count  = 2;
    info.p_category_list = categories;
    EXPECT_EQ(info.get(), KU_E_INVALID_ARGUMENT);
    EXPECT_TRUE(info.is_empty());
}

TEST(the_locale, refuses_a_count_without_an_array)
{
    locale_info info;
    info.item_count = 1;
    EXPECT_EQ(info.get(), KU_E_INVALID_ARGUMENT);
    EXPECT_TRUE(info.is_empty());
    EXPECT_EQ(ku_get_locale_info_1(nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr),
              KU_E_INVALID_ARGUMENT);
}

TEST(the_locale, delivers_nothing_when_any_allocation_fails)
{
    kt_test::fault_scope scope;
    for (unsigned nth = 1; nth <= 5; nth++) {
        kt_int32_t  category = LC_TIME, item = DAY_1;
        locale_info info;
        info.category_count  = 1;
        info.p_category_list = &category;
        info.item_count      = 1;
        info.p_item_list     = &item;
        kt_test::fail_call(kt_test::call::allocation, nth, ENOMEM);
        const kt_int32_t rc     = info.get();
        const bool       failed = kt_test::failed_as_asked(kt_test::call::allocation);
        kt_test::reset_calls();
        ASSERT_TRUE(failed) << nth;
        EXPECT_EQ(rc, KU_E_NO_MEMORY);
        EXPECT_TRUE(info.is_empty());
    }
}

} // namespace
