// SPDX-License-Identifier: MIT
// The error record of each thread, and the message catalogs.
#include <gtest/gtest.h>

#include <locale.h>
#include <sys/resource.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "../../support/ku/ku_catalog.h"
#include "kt_ku.h"
#include "support/faults.h"
#include "support/registry.h"

namespace
{

constexpr char text_of_system_call[] = "2605-010 The %1$s system call unexpectedly returned an errno of %2$d to the "
                                       "%3$s function near line %4$d of file %5$s, version %6$s.\n";

ku_error_record_t record()
{
    ku_error_record_t result;
    ku_get_error_record_1(&result);
    return result;
}

// A locale other than C, a catalog found through NLSPATH, and both taken back at the end.
class with_catalog
{
  public:
    with_catalog(const std::string & name, const std::string & source)
    {
        kt_test::write_file(dir_.file("source"), kt_test::bytes(source.begin(), source.end()));
        const std::string command = "gencat " + dir_.file(name) + " " + dir_.file("source");
        EXPECT_EQ(std::system(command.c_str()), 0);
        setenv("NLSPATH", (dir_.path() + "/%N").c_str(), 1);
        EXPECT_NE(setlocale(LC_MESSAGES, "C.UTF-8"), nullptr);
    }
    ~with_catalog()
    {
        setlocale(LC_MESSAGES, "C");
        unsetenv("NLSPATH");
    }
    with_catalog(const with_catalog &)             = delete;
    with_catalog & operator=(const with_catalog &) = delete;
    std::string    file(const std::string & name) const { return dir_.file(name); }

  private:
    kt_test::temp_dir dir_;
};

TEST(the_error_record, tells_what_was_set)
{
    ku_set_error_1(10, 0, "kt_rg.cat", 1, 1, text_of_system_call, "read", 5, "rg_i_x", 17, "rg_i_x.cpp", "1.0");
    const ku_error_record_t r = record();
    EXPECT_EQ(r.code, 10);
    EXPECT_EQ(r.set, 1);
    EXPECT_EQ(r.message, 1);
    EXPECT_STREQ(r.p_catalog, "kt_rg.cat");
    EXPECT_STREQ(r.p_text, "2605-010 The read system call unexpectedly returned an errno of 5 to the rg_i_x function "
                           "near line 17 of file rg_i_x.cpp, version 1.0.\n");
}

TEST(the_error_record, is_empty_after_it_was_cleared)
{
    ku_set_error_1(101, 0, "kt_rg.cat", 1, 8, "2605-101 A function was passed a NULL pointer.\n");
    ku_set_no_error_1();
    const ku_error_record_t r = record();
    EXPECT_EQ(r.code, 0);
    EXPECT_EQ(r.set, 0);
    EXPECT_EQ(r.message, 0);
    EXPECT_STREQ(r.p_catalog, "");
    EXPECT_STREQ(r.p_text, "");
}

TEST(the_error_record, is_replaced_by_the_next_failure)
{
    ku_set_error_1(102, 0, "kt_rg.cat", 1, 9, "2605-102 %1$s is an invalid pathname.\n", "/a/long/path/first");
    ku_set_error_1(200, 0, "other.cat", 2, 17, "2605-200 The table does not exist.\n");
    EXPECT_EQ(record().code, 200);
    EXPECT_EQ(record().set, 2);
    EXPECT_STREQ(record().p_catalog, "other.cat");
    EXPECT_STREQ(record().p_text, "2605-200 The table does not exist.\n");
}

TEST(the_error_record, holds_its_texts_by_itself)
{
    std::string path = "/some/path";
    std::string name = "mine.cat";
    ku_set_error_1(102, 0, name.c_str(), 1, 9, "%1$s is an invalid pathname.\n", path.c_str());
    path.assign(path.size(), 'x');
    name.assign(name.size(), 'x');
    EXPECT_STREQ(record().p_text, "/some/path is an invalid pathname.\n");
    EXPECT_STREQ(record().p_catalog, "mine.cat");
}

TEST(the_error_record, has_room_for_two_paths_of_4095_bytes)
{
    const std::string device(4095, 'd'), directory(4095, 'm');
    ku_set_error_1(16, 0, "kt_rg.cat", 1, 30, "full: mounted(%1$s) mounted_over(%2$s).\n", device.c_str(),
                   directory.c_str());
    EXPECT_EQ(record().p_text, "full: mounted(" + device + ") mounted_over(" + directory + ").\n");
}

TEST(the_error_record, cuts_a_longer_text_between_characters_and_keeps_the_newline)
{
    for (size_t shift = 0; shift < 3; shift++) {
        std::string path(shift, 'a');
        for (int i = 0; i < 10000; i++)
            path += "\xE2\x82\xAC";
        ku_set_error_1(102, 0, "kt_rg.cat", 1, 9, "%1$s is an invalid pathname.\n", path.c_str());
        const std::string text = record().p_text;
        EXPECT_GE(text.size(), 12000u);
        EXPECT_EQ(text.back(), '\n');
        EXPECT_EQ((text.size() - 1 - shift) % 3, 0u);
        EXPECT_EQ(text.substr(0, text.size() - 1), path.substr(0, text.size() - 1));
    }
}

TEST(the_error_record, needs_no_allocation)
{
    std::thread([] {
        kt_test::fault_scope scope;
        kt_test::fail_call(kt_test::call::allocation, 1, ENOMEM, kt_test::for_good);
        ku_set_error_1(12, 0, "kt_rg.cat", 1, 3, "2605-012 no memory in %1$s near line %2$d.\n", "f", 9);
        const unsigned made = kt_test::calls_made(kt_test::call::allocation);
        kt_test::reset_calls();
        EXPECT_EQ(made, 0u);
        EXPECT_STREQ(record().p_text, "2605-012 no memory in f near line 9.\n");
    }).join();
}

TEST(the_error_record, has_its_code_and_a_text_even_if_the_system_gives_no_page)
{
    std::thread([] {
        rlimit before;
        ASSERT_EQ(getrlimit(RLIMIT_AS, &before), 0);
        rlimit none   = before;
        none.rlim_cur = 4096;
        ASSERT_EQ(setrlimit(RLIMIT_AS, &none), 0);
        ku_set_error_1(12, 0, "kt_rg.cat", 1, 3, "2605-012 no memory in %1$s near line %2$d.\n", "f", 9);
        const ku_error_record_t r = record();
        ASSERT_EQ(setrlimit(RLIMIT_AS, &before), 0);
        EXPECT_EQ(r.code, 12);
        EXPECT_EQ(r.message, 3);
        EXPECT_STREQ(r.p_catalog, "kt_rg.cat");
        EXPECT_STREQ(r.p_text, "2605-012 no memory in %1$s near line %2$d.\n");
        ku_set_error_1(12, 0, "kt_rg.cat", 1, 3, "2605-012 no memory in %1$s near line %2$d.\n", "f", 9);
        EXPECT_STREQ(record().p_text, "2605-012 no memory in f near line 9.\n");
    }).join();
}

TEST(the_error_record, leaves_errno_alone)
{
    errno = EXDEV;
    ku_set_error_1(101, 0, "kt_rg.cat", 1, 8, "2605-101 A function was passed a NULL pointer.\n");
    EXPECT_EQ(errno, EXDEV);
    ku_set_no_error_1();
    EXPECT_EQ(errno, EXDEV);
}

TEST(the_error_record, takes_null_for_a_catalog_and_for_a_text)
{
    ku_set_error_1(7, 0, nullptr, 1, 2, nullptr);
    EXPECT_EQ(record().code, 7);
    EXPECT_STREQ(record().p_catalog, "");
    EXPECT_STREQ(record().p_text, "");
    ku_get_error_record_1(nullptr);
    EXPECT_EQ(record().code, 7);
}

TEST(threads_error_record, each_thread_has_its_own)
{
    std::atomic<int>         ready{0};
    std::vector<std::thread> threads;
    for (int i = 1; i <= 8; i++) {
        threads.emplace_back([i, &ready] {
            EXPECT_EQ(record().code, 0);
            ku_set_error_1(100 + i, 0, "kt_rg.cat", 1, i, "message %1$d\n", i);
            ready++;
            while (ready < 8)
                std::this_thread::yield();
            for (int round = 0; round < 1000; round++) {
                EXPECT_EQ(record().code, 100 + i);
                EXPECT_EQ(record().p_text, "message " + std::to_string(i) + "\n");
                ku_set_no_error_1();
                EXPECT_EQ(record().code, 0);
                ku_set_error_1(100 + i, 0, "kt_rg.cat", 1, i, "message %1$d\n", i);
            }
        });
    }
    for (std::thread & t : threads)
        t.join();
}

TEST(the_message_catalog, gives_the_translated_text_with_its_own_order_of_arguments)
{
    with_catalog catalog("order.cat", "$set 1\n1 Die Funktion %3$s bekam errno %2$d von %1$s (%6$s, %5$s:%4$d).\n");
    ku_set_error_1(10, 0, "order.cat", 1, 1, text_of_system_call, "read", 5, "rg_i_x", 17, "rg_i_x.cpp", "1.0");
    EXPECT_STREQ(record().p_text, "Die Funktion rg_i_x bekam errno 5 von read (1.0, rg_i_x.cpp:17).");
}

TEST(the_message_catalog, is_not_asked_in_the_c_locale)
{
    with_catalog catalog("plain.cat", "$set 1\n8 translated\n");
    setlocale(LC_MESSAGES, "C");
    ku_set_error_1(101, 0, "plain.cat", 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "default\n");
    setlocale(LC_MESSAGES, "C.UTF-8");
    ku_set_error_1(101, 0, "plain.cat", 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "translated");
}

TEST(the_message_catalog, is_opened_once)
{
    with_catalog catalog("once.cat", "$set 1\n8 translated\n");
    ku_set_error_1(101, 0, "once.cat", 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "translated");
    ASSERT_EQ(std::remove(catalog.file("once.cat").c_str()), 0);
    ku_set_error_1(101, 0, "once.cat", 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "translated");
}

TEST(the_message_catalog, leaves_the_default_text_where_it_has_none)
{
    with_catalog catalog("holes.cat", "$set 1\n8 translated\n");
    ku_set_error_1(200, 0, "holes.cat", 1, 17, "default %1$d\n", 4);
    EXPECT_STREQ(record().p_text, "default 4\n");
    ku_set_error_1(200, 0, "holes.cat", 2, 8, "default\n");
    EXPECT_STREQ(record().p_text, "default\n");
    ku_set_error_1(200, 0, "there-is-no-such.cat", 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "default\n");
}

TEST(the_message_catalog, cannot_make_a_number_be_read_as_a_pointer)
{
    with_catalog catalog("wrong.cat", "$set 1\n1 errno %2$s\n2 %1$s%1$n\n3 %1$s %2$d %3$s\n4 no arguments\n");
    for (const int index : {1, 2, 3, 4}) {
        ku_set_error_1(10, 0, "wrong.cat", 1, index, "default %1$s %2$d\n", "read", 5);
        EXPECT_STREQ(record().p_text, "default read 5\n") << index;
    }
}

TEST(the_message_catalog, survives_many_catalogs_and_names_of_any_length)
{
    with_catalog catalog("many.cat", "$set 1\n8 translated\n");
    for (int i = 0; i < 40; i++) {
        ku_set_error_1(101, 0, ("no" + std::to_string(i) + ".cat").c_str(), 1, 8, "default\n");
        EXPECT_STREQ(record().p_text, "default\n");
    }
    const std::string long_name(500, 'n');
    ku_set_error_1(101, 0, long_name.c_str(), 1, 8, "default\n");
    EXPECT_STREQ(record().p_text, "default\n");
    EXPECT_EQ(record().p_catalog, long_name.substr(0, 127));
}

TEST(conversions, match_only_if_both_texts_take_the_same_arguments)
{
    EXPECT_TRUE(ku_conversions_match("", ""));
    EXPECT_TRUE(ku_conversions_match("100 %% of %1$s", "%1$s"));
    EXPECT_TRUE(ku_conversions_match("%2$d %1$s", "%1$s %2$d"));
    EXPECT_TRUE(ku_conversions_match("%1$s %1$s", "%1$s"));
    EXPECT_TRUE(ku_conversions_match("%s %d", "%1$s %2$d"));
    EXPECT_TRUE(ku_conversions_match("%1$-20.10s", "%1$s"));
    EXPECT_TRUE(ku_conversions_match("%1$x", "%1$d"));
    EXPECT_FALSE(ku_conversions_match("%1$s", "%1$d"));
    EXPECT_FALSE(ku_conversions_match("%1$ld", "%1$d"));
    EXPECT_FALSE(ku_conversions_match("%1$s %1$d", "%1$s"));
    EXPECT_FALSE(ku_conversions_match("%1$s %3$d", "%1$s %2$d"));
    EXPECT_FALSE(ku_conversions_match("%1$s %d", "%1$s %2$d"));
    EXPECT_FALSE(ku_conversions_match("%d %1$s", "%1$s %2$d"));
    EXPECT_FALSE(ku_conversions_match("%1$*2$s %2$d", "%1$s %2$d"));
    EXPECT_FALSE(ku_conversions_match("%1$99999s", "%1$s"));
    EXPECT_FALSE(ku_conversions_match("%1$n", "%1$s"));
    EXPECT_FALSE(ku_conversions_match("%0$s", "%1$s"));
    EXPECT_FALSE(ku_conversions_match("%99$s", "%99$s"));
    EXPECT_FALSE(ku_conversions_match("%", ""));
    EXPECT_FALSE(ku_conversions_match("50%", ""));
}

TEST(threads_error_record, several_threads_find_a_catalog_at_once)
{
    with_catalog             catalog("shared.cat", "$set 1\n8 translated\n");
    std::atomic<int>         translated{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; i++) {
        threads.emplace_back([&translated] {
            for (int round = 0; round < 200; round++) {
                ku_set_error_1(101, 0, "shared.cat", 1, 8, "default\n");
                const std::string text = record().p_text;
                EXPECT_TRUE(text == "translated" || text == "default\n") << text;
            }
            ku_set_error_1(101, 0, "shared.cat", 1, 8, "default\n");
            translated += std::string(record().p_text) == "translated" ? 1 : 0;
        });
    }
    for (std::thread & t : threads)
        t.join();
    EXPECT_GE(translated, 1);
}

} // namespace
