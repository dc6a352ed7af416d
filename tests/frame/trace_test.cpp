// SPDX-License-Identifier: MIT
// Reporting a failure: the record with its arguments, and the events that the Errors level asks for.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "frame/rg_i_trace.h"
#include "support/faults.h"
#include "support/registry.h"
#include "support/trace.h"

using namespace kt_test;

namespace
{

constexpr char module_version[] = "trace_test 1.0";

const rg_i_site_t SITE{"the_function", 321, "the_file.cpp", "the_version 1.0"};

std::string string_of(const bytes & content)
{
    return std::string(content.begin(), content.end());
}

// What a missing key of the type looks like in the message.
std::string rendered(kt_value_t value, kt_data_type_t type)
{
    trace_key_not_found(text("table"), value, type);
    EXPECT_EQ(error_code(), 202);
    const std::string before  = "2605-213 There is no row corresponding to the specified key value (";
    const std::string behind  = ") in table (table).\n";
    const std::string message = error_text();
    EXPECT_EQ(message.substr(0, before.size()), before);
    EXPECT_EQ(message.substr(message.size() - behind.size()), behind);
    return message.substr(before.size(), message.size() - before.size() - behind.size());
}

// The file system that a table of mounts names for a path.
struct filesystem {
    int         result;
    std::string device;
    std::string directory;
};

filesystem find(const std::string & table_of_mounts, const std::string & path)
{
    const temp_dir dir;
    write_file(dir.file("mtab"), bytes(table_of_mounts.begin(), table_of_mounts.end()));
    char      device[RG_I_MOUNT_TEXT_SIZE];
    char      directory[RG_I_MOUNT_TEXT_SIZE];
    const int result = rg_i_find_filesystem(dir.file("mtab").c_str(), path.c_str(), device, directory);
    return {result, device, directory};
}

void expect_filesystem(const filesystem & found, const std::string & device, const std::string & directory)
{
    EXPECT_EQ(found.result, 0);
    EXPECT_EQ(found.device, device);
    EXPECT_EQ(found.directory, directory);
}

// The working directory, changed for a test.
class in_directory
{
  public:
    explicit in_directory(const std::string & path) : before_(std::filesystem::current_path())
    {
        std::filesystem::current_path(path);
    }
    ~in_directory() { std::filesystem::current_path(before_); }
    in_directory(const in_directory &)             = delete;
    in_directory & operator=(const in_directory &) = delete;

  private:
    std::filesystem::path before_;
};

std::string errno_file_name()
{
    return "reginfo_pid." + std::to_string(getpid());
}

} // namespace

// ---- Message arguments ----

TEST(reporting, a_system_call_is_told_with_its_name_errno_and_place)
{
    EXPECT_EQ(rg_i_fail_system_call(SITE, "rename", 18), 10);
    EXPECT_EQ(error_code(), 10);
    EXPECT_EQ(error_message_index(), 1);
    EXPECT_EQ(error_text(), "2605-010 The rename system call unexpectedly returned an errno of 18 to the the_function "
                            "function near line 321 of file the_file.cpp, version the_version 1.0.\n");
}

TEST(reporting, a_library_function_is_told_with_its_name_result_and_place)
{
    EXPECT_EQ(rg_i_fail_library_call(SITE, "ku_iconv_str", -3), 11);
    EXPECT_EQ(error_code(), 11);
    EXPECT_EQ(error_message_index(), 2);
    EXPECT_EQ(error_text(), "2605-011 The ku_iconv_str library function unexpectedly returned -3 to the the_function "
                            "function near line 321 of file the_file.cpp, version the_version 1.0.\n");
}

TEST(reporting, a_failed_allocation_is_told_with_its_place)
{
    EXPECT_EQ(rg_i_fail_no_memory(SITE), 12);
    EXPECT_EQ(error_message_index(), 3);
    EXPECT_EQ(error_text(), "2605-012 Memory could not be allocated in the the_function function near line 321 of file "
                            "the_file.cpp, version the_version 1.0.\n");
}

TEST(reporting, an_internal_inconsistency_is_told_with_its_place)
{
    EXPECT_EQ(rg_i_fail_internal(SITE), 15);
    EXPECT_EQ(error_message_index(), 6);
    EXPECT_EQ(error_text(), "2605-015 An irrecoverable internal inconsistency occurred during the the_function "
                            "function near line 321 of file the_file.cpp, version the_version 1.0.\n");
}

TEST(reporting, a_bad_path_stands_in_the_message_and_a_null_path_has_a_name)
{
    EXPECT_EQ(rg_i_fail_invalid_path(SITE, "a b"), 102);
    EXPECT_EQ(error_message_index(), 9);
    EXPECT_EQ(error_text(), "2605-102 a b is an invalid pathname.\n");
    EXPECT_EQ(rg_i_fail_invalid_path(SITE, nullptr), 102);
    EXPECT_EQ(error_text(), "2605-102 <NULL POINTER> is an invalid pathname.\n");
}

TEST(reporting, a_bad_variable_stands_in_the_message)
{
    EXPECT_EQ(rg_i_fail_invalid_variable(SITE, "%q"), 109);
    EXPECT_EQ(error_message_index(), 16);
    EXPECT_EQ(error_text(), "2605-109 An invalid positional/replacement variable type was found in the selection "
                            "criteria string: %q.\n");
}

TEST(reporting, here_is_the_bare_name_of_the_function_and_of_the_file)
{
    const rg_i_site_t here = RG_HERE;
    EXPECT_STREQ(here.p_function, "TestBody");
    EXPECT_STREQ(here.p_source_file, "trace_test.cpp");
    EXPECT_STREQ(here.p_version, "trace_test 1.0");
}

// ---- Events ----

TEST(reporting, with_all_levels_at_0_a_failure_sets_the_record_and_makes_no_event)
{
    const trace_catcher trace(0, 0);
    EXPECT_EQ(rg_i_fail(SITE, 207), 207);
    EXPECT_EQ(error_code(), 207);
    EXPECT_EQ(error_message_index(), 24);
    EXPECT_TRUE(trace.events().empty());
}

TEST(reporting, with_the_errors_level_set_each_failure_makes_an_event_with_its_place)
{
    const trace_catcher trace(0, 1);
    EXPECT_EQ(rg_i_fail(SITE, 207), 207);
    EXPECT_EQ(rg_i_fail_no_memory(SITE), 12);
    ASSERT_EQ(trace.events().size(), 2u);
    for (const event & e : trace.events()) {
        EXPECT_EQ(e.kind, TR_EVENT_ERROR);
        EXPECT_EQ(e.component, "_RGA");
        EXPECT_EQ(e.id, 0u);
        EXPECT_EQ(e.function, "the_function");
        EXPECT_EQ(e.line, 321u);
        EXPECT_EQ(e.source_file, "the_file.cpp");
    }
}

TEST(reporting, the_record_is_set_before_the_event)
{
    trace_catcher trace(0, 1);
    ku_set_no_error_1();
    kt_int32_t code_at_event = -1;
    trace.on_event([&](const event &) { code_at_event = error_code(); });
    EXPECT_EQ(rg_i_fail(SITE, 211), 211);
    EXPECT_EQ(code_at_event, 211);
}

TEST(reporting, a_missing_key_makes_the_event_of_its_strings_and_the_event_of_its_place)
{
    const trace_catcher trace(0, 1);
    trace_key_not_found(SITE, text("/t"), int32(-5), KT_INT32);
    ASSERT_EQ(trace.events().size(), 2u);
    EXPECT_EQ(trace.events()[0].kind, TR_EVENT_STRINGS);
    EXPECT_EQ(trace.events()[0].component, "_RGA");
    EXPECT_EQ(trace.events()[0].id, 120u);
    EXPECT_EQ(trace.events()[0].strings, (std::vector<std::string>{"-5", "/t"}));
    EXPECT_EQ(trace.events()[1].kind, TR_EVENT_ERROR);
    EXPECT_EQ(trace.events()[1].function, "the_function");
}

TEST(reporting, a_missing_key_told_without_a_place_names_the_report_itself)
{
    const trace_catcher trace(0, 1);
    trace_key_not_found(text("/t"), int32(-5), KT_INT32);
    ASSERT_EQ(trace.events().size(), 2u);
    EXPECT_EQ(trace.events()[1].function, "trace_key_not_found");
}

TEST(reporting, a_full_file_system_makes_the_event_of_its_strings_and_the_event_of_its_place)
{
    char device[RG_I_MOUNT_TEXT_SIZE];
    char directory[RG_I_MOUNT_TEXT_SIZE];
    get_filesystem_containing_file(text("/no_such_directory/x"), device, directory);

    const trace_catcher trace(0, 1);
    trace_filesystem_full_for_path(SITE, text("/no_such_directory/x"));
    EXPECT_EQ(error_code(), 16);
    EXPECT_EQ(error_message_index(), 30);
    EXPECT_EQ(error_text(), std::string("2605-016 The filesystem containing the local tree is full: mounted(") +
                                device + ") mounted_over(" + directory + ").\n");
    ASSERT_EQ(trace.events().size(), 2u);
    EXPECT_EQ(trace.events()[0].kind, TR_EVENT_STRINGS);
    EXPECT_EQ(trace.events()[0].id, 119u);
    EXPECT_EQ(trace.events()[0].strings, (std::vector<std::string>{device, directory}));
    EXPECT_EQ(trace.events()[1].kind, TR_EVENT_ERROR);
    EXPECT_EQ(trace.events()[1].function, "the_function");
}

TEST(reporting, with_all_levels_at_0_the_reports_with_strings_make_no_event)
{
    const trace_catcher trace(0, 0);
    trace_filesystem_full_for_path(text("/x"));
    EXPECT_EQ(error_code(), 16);
    trace_key_not_found(nullptr, int32(1), KT_INT32);
    EXPECT_EQ(error_code(), 202);
    EXPECT_TRUE(trace.events().empty());
}

TEST(trace_categories, the_component_has_three_and_all_start_at_level_0)
{
    const char * const names[] = {"API", "Errors", "Wherever"};
    for (kt_uint32_t i = 0; i < 3; ++i) {
        EXPECT_EQ(Rg_Trace_Categories[i].category_id, i);
        EXPECT_STREQ(Rg_Trace_Categories[i].category_name, names[i]);
        EXPECT_EQ(Rg_Trace_Categories[i].default_level_of_detail, 0u);
        EXPECT_EQ(Rg_Trace_Categories[i].minimum_level_of_detail, 0u);
        EXPECT_EQ(Rg_Trace_Level_Of_Detail[i], 0);
    }
    EXPECT_STREQ(RG_I_TRACE_COMPONENT, "_RGA");
}

// ---- A missing key ----

TEST(missing_keys, integers_are_rendered_in_decimal)
{
    EXPECT_EQ(rendered(int32(-2147483647 - 1), KT_INT32), "-2147483648");
    EXPECT_EQ(rendered(uint32(4294967295u), KT_UINT32), "4294967295");
    EXPECT_EQ(rendered(int64(INT64_MIN), KT_INT64), "-9223372036854775808");
    EXPECT_EQ(rendered(uint64(UINT64_MAX), KT_UINT64), "18446744073709551615");
}

TEST(missing_keys, floating_point_numbers_are_rendered_shortest)
{
    EXPECT_EQ(rendered(float32(1.5f), KT_FLOAT32), "1.5");
    EXPECT_EQ(rendered(float64(1e100), KT_FLOAT64), "1e+100");
    EXPECT_EQ(rendered(float64(0.1), KT_FLOAT64), "0.1");
}

TEST(missing_keys, a_string_of_300_bytes_is_cut_to_255)
{
    EXPECT_EQ(rendered(string(std::string(255, 'k')), KT_CHAR_PTR), std::string(255, 'k'));
    EXPECT_EQ(rendered(string(std::string(300, 'k')), KT_CHAR_PTR), std::string(255, 'k'));
    EXPECT_EQ(rendered(string(""), KT_CHAR_PTR), "");
}

TEST(missing_keys, a_resource_handle_is_rendered_in_hexadecimal_with_its_header_halves_in_memory_order)
{
    kt_resource_handle_t handle{};
    const kt_uint16_t    halves[2] = {0x1234, 0xabcd};
    std::memcpy(&handle.header, halves, sizeof halves);
    handle.id = {0x1, 0xdeadbeef, 0x20, 0xffffffff};
    kt_value_t value;
    value.ptr_rsrc_handle = &handle;
    EXPECT_EQ(rendered(value, KT_RSRC_HANDLE_PTR), "0x1234 0xabcd 0x00000001 0xdeadbeef 0x00000020 0xffffffff");
}

TEST(missing_keys, keys_of_other_types_have_a_filler)
{
    const kt_data_type_t types[] = {KT_UNKNOWN,      KT_NONE, KT_BINARY_PTR, KT_SD_PTR, KT_SBS_PTR, KT_INT32_ARRAY,
                                    KT_SD_PTR_ARRAY, 23,      1000};
    for (const kt_data_type_t type : types)
        EXPECT_EQ(rendered(null_value(), type), "***UNKNOWN KEY TYPE****") << type;
}

TEST(missing_keys, a_null_key_is_the_empty_value)
{
    EXPECT_EQ(rendered(null_value(), KT_CHAR_PTR), "");
    EXPECT_EQ(rendered(null_value(), KT_RSRC_HANDLE_PTR).size(), std::strlen("0x0000 0x0000 ") + 4 * 10 + 3);
}

TEST(missing_keys, a_table_without_a_name_has_a_filler)
{
    trace_key_not_found(nullptr, int32(3), KT_INT32);
    EXPECT_EQ(error_text(), "2605-213 There is no row corresponding to the specified key value (3) in table "
                            "((UNKNOWN_TABLE_NAME)).\n");
}

TEST(missing_keys, conversions_in_a_key_are_text)
{
    EXPECT_EQ(rendered(string("%1$s%n%s"), KT_CHAR_PTR), "%1$s%n%s");
}

// ---- The table of mounts ----

TEST(table_of_mounts, a_path_is_on_the_mount_that_it_lies_in)
{
    const std::string mounts = "/dev/a / ext4 rw 0 0\n/dev/b /data ext4 rw 0 0\n";
    expect_filesystem(find(mounts, "/data/t"), "/dev/b", "/data");
    expect_filesystem(find(mounts, "/data"), "/dev/b", "/data");
    expect_filesystem(find(mounts, "/etc/t"), "/dev/a", "/");
}

TEST(table_of_mounts, a_directory_whose_name_merely_begins_like_a_mount_is_not_on_it)
{
    const std::string mounts = "/dev/a / ext4 rw 0 0\n/dev/b /data ext4 rw 0 0\n";
    expect_filesystem(find(mounts, "/database/t"), "/dev/a", "/");
}

TEST(table_of_mounts, of_nested_mounts_the_longer_one_wins_in_either_order)
{
    const std::string outer = "/dev/o /data ext4 rw 0 0\n";
    const std::string inner = "/dev/i /data/deep ext4 rw 0 0\n";
    expect_filesystem(find(outer + inner, "/data/deep/t"), "/dev/i", "/data/deep");
    expect_filesystem(find(inner + outer, "/data/deep/t"), "/dev/i", "/data/deep");
    expect_filesystem(find(inner + outer, "/data/deeper/t"), "/dev/o", "/data");
}

TEST(table_of_mounts, among_equals_the_first_line_wins)
{
    expect_filesystem(find("/dev/1 /data x rw\n/dev/2 /data x rw\n", "/data/t"), "/dev/1", "/data");
}

TEST(table_of_mounts, of_several_root_lines_the_last_one_names_the_device)
{
    expect_filesystem(find("rootfs / rootfs rw\n/dev/r / ext4 rw\n/dev/b /data ext4 rw\n", "/etc"), "/dev/r", "/");
}

TEST(table_of_mounts, without_a_root_line_the_device_is_unknown)
{
    expect_filesystem(find("/dev/b /data ext4 rw\n", "/etc"), "UNKNOWN", "/");
    expect_filesystem(find("", "/etc"), "UNKNOWN", "/");
}

TEST(table_of_mounts, lines_without_three_fields_are_passed_over)
{
    expect_filesystem(find("/dev/b /data\n\n# comment\n/dev/c /data ext4\n", "/data/t"), "/dev/c", "/data");
}

TEST(table_of_mounts, lines_longer_than_the_buffer_are_read_without_harm)
{
    const std::string long_device(10000, 'd');
    const std::string long_directory = "/" + std::string(10000, 'm');
    const filesystem  found = find(long_device + " " + long_directory + " ext4 rw\n/dev/b /data ext4 rw\n", "/data/t");
    expect_filesystem(found, "/dev/b", "/data");
}

TEST(table_of_mounts, one_that_cannot_be_read_leaves_unknown)
{
    char device[RG_I_MOUNT_TEXT_SIZE];
    char directory[RG_I_MOUNT_TEXT_SIZE];
    EXPECT_EQ(rg_i_find_filesystem("/no_such_file", "/data", device, directory), -1);
    EXPECT_STREQ(device, "UNKNOWN");
    EXPECT_STREQ(directory, "UNKNOWN");
}

// ---- The witness of a failing flush ----

TEST(capturing_an_errno, leaves_one_line_in_a_file_of_the_working_directory)
{
    const temp_dir     dir;
    const in_directory here(dir.path());
    errno = 77;
    rg_i_capture_errno(text("fdatasync"), 28, 12, text("files 1.0"));
    EXPECT_EQ(errno, 77);
    EXPECT_EQ(string_of(read_file(errno_file_name())), "function(fdatasync) errno(28) line(12) sccsid(files 1.0)\n");
}

TEST(capturing_an_errno, a_second_failure_replaces_the_first_ones_line)
{
    const temp_dir     dir;
    const in_directory here(dir.path());
    rg_i_capture_errno(text("a_function_with_a_long_name"), 28, 12, text("files 1.0"));
    rg_i_capture_errno(text("f"), 5, 1, text("v"));
    EXPECT_EQ(string_of(read_file(errno_file_name())), "function(f) errno(5) line(1) sccsid(v)\n");
}

TEST(capturing_an_errno, does_nothing_where_the_file_cannot_be_made)
{
    const temp_dir     dir;
    const in_directory here(dir.path());
    std::filesystem::create_directory(errno_file_name());
    rg_i_capture_errno(text("f"), 5, 1, text("v"));
    EXPECT_TRUE(std::filesystem::is_empty(errno_file_name()));
}

// ---- Threads ----

TEST(threads_report, failures_while_levels_change_and_each_sees_its_own_record)
{
    const trace_catcher      registered(0, 0);
    std::vector<std::thread> threads;
    tr_set_sink_1([](void *, const tr_event_t *) {}, nullptr);
    for (const kt_int32_t code : {200, 201, 203})
        threads.emplace_back([code] {
            for (int round = 0; round < 200; ++round) {
                EXPECT_EQ(rg_i_fail(SITE, code), code);
                EXPECT_EQ(error_code(), code);
            }
        });
    for (int round = 0; round < 200; ++round)
        EXPECT_EQ(tr_set_level_1("_RGA", "Errors", static_cast<kt_uint32_t>(round % 2)), 0);
    for (std::thread & thread : threads)
        thread.join();
}
