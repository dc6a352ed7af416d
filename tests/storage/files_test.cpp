// SPDX-License-Identifier: MIT
// The file calls: interrupted calls, short writes, a full file system.
#include "storage/rg_i_files.h"

#include <fcntl.h>
#include <sys/wait.h>

#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

struct writing_files : testing::Test {
    temp_dir          dir;
    working_directory here;
    fault_scope       faults;
    int               fd = ::open(dir.file("f").c_str(), O_RDWR | O_CREAT, 0644);

    writing_files() { reset_calls(); }
    ~writing_files() override { ::close(fd); }

    std::string content() const
    {
        const bytes b = read_file(dir.file("f"));
        return {b.begin(), b.end()};
    }
    // Pauses are counted and not slept.
    void don_t_sleep() { fail_call(call::usleep, 1, 0, for_good); }
};
struct writing_whole_buffers : writing_files {
};
struct opening_files : writing_files {
};
struct syncing_files : writing_files {
};

struct vector_of_three {
    std::string  a = "abc", b = "defg", c = "hi";
    struct iovec elements[3] = {{a.data(), 3}, {b.data(), 4}, {c.data(), 2}};
};

} // namespace

TEST_F(writing_files, a_vector_is_written_whole_in_one_call)
{
    vector_of_three v;
    kt_uint32_t     written = 5;
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), 0);
    EXPECT_EQ(written, 14u) << "the counter runs over several calls";
    EXPECT_EQ(content(), "abcdefghi");
    EXPECT_EQ(calls_made(call::writev), 1u);
}

TEST_F(writing_files, a_short_write_goes_on_where_it_stopped_at_every_length)
{
    for (size_t shortened = 1; shortened < 9; ++shortened) {
        ASSERT_EQ(lseek(fd, 0, SEEK_SET), 0);
        ASSERT_EQ(ftruncate(fd, 0), 0);
        vector_of_three v;
        kt_uint32_t     written = 0;
        shorten_write(call::writev, 1, shortened);
        EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), 0) << shortened;
        EXPECT_EQ(written, 9u) << shortened;
        EXPECT_EQ(content(), "abcdefghi") << shortened;
    }
}

TEST_F(writing_files, an_element_written_exactly_stays_in_the_vector_with_length_0)
{
    vector_of_three v;
    kt_uint32_t     written = 0;
    shorten_write(call::writev, 1, 3);
    before_call(call::writev, 2, [&] {
        EXPECT_EQ(v.elements[0].iov_len, 0u);
        EXPECT_EQ(v.elements[0].iov_base, v.a.data() + 3);
        EXPECT_EQ(v.elements[1].iov_len, 4u);
    });
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), 0);
    EXPECT_EQ(content(), "abcdefghi");
    EXPECT_EQ(calls_made(call::writev), 2u);
}

TEST_F(writing_files, a_full_file_system_in_the_middle_gives_16_without_a_record_and_counts_the_part)
{
    vector_of_three v;
    kt_uint32_t     written = 0;
    ku_set_no_error_1();
    shorten_write(call::writev, 1, 5);
    fail_call(call::writev, 2, ENOSPC);
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_FILESYSTEM_FULL_DETAIL);
    EXPECT_EQ(written, 5u);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(content(), "abcde") << "what was written stays";
}

TEST_F(writing_files, any_other_errno_is_reported_by_the_name_of_the_call_and_not_retried)
{
    for (const int the_errno : {EIO, EAGAIN, EFBIG, EDQUOT, EROFS}) {
        reset_calls();
        vector_of_three v;
        kt_uint32_t     written = 0;
        fail_call(call::writev, 1, the_errno);
        EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_SYSTEM_CALL);
        EXPECT_EQ(error_code(), RG_E_SYSTEM_CALL);
        EXPECT_NE(error_text().find("The writev system call unexpectedly returned an errno of " +
                                    std::to_string(the_errno) + " to the rg_i_writev function"),
                  std::string::npos)
            << error_text();
        EXPECT_EQ(calls_made(call::writev), 1u);
    }
}

TEST_F(writing_files, a_hundred_interruptions_and_a_success_leave_one_line)
{
    don_t_sleep();
    vector_of_three v;
    kt_uint32_t     written = 0;
    trace_lines     lines;
    fail_call(call::writev, 1, EINTR, 100);
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), 0);
    EXPECT_EQ(calls_made(call::writev), 101u);
    EXPECT_EQ(calls_made(call::usleep), 100u);
    const auto left = lines.with("DV|RET|");
    ASSERT_EQ(left.size(), 1u);
    EXPECT_EQ(trace_lines::field(left[0], 3), "100");
    EXPECT_EQ(trace_lines::field(left[0], 4), "100");
}

TEST_F(writing_files, a_hundred_and_one_interruptions_give_10_and_leave_one_line)
{
    don_t_sleep();
    vector_of_three v;
    kt_uint32_t     written = 0;
    trace_lines     lines;
    fail_call(call::writev, 1, EINTR, 101);
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_SYSTEM_CALL);
    EXPECT_EQ(calls_made(call::writev), 101u);
    EXPECT_NE(error_text().find("errno of " + std::to_string(EINTR)), std::string::npos);
    ASSERT_EQ(lines.with("DV|RET|").size(), 1u);
    EXPECT_EQ(trace_lines::field(lines.with("DV|RET|")[0], 3), "100");
}

TEST_F(writing_files, retries_are_counted_on_over_a_partial_write)
{
    don_t_sleep();
    vector_of_three v;
    kt_uint32_t     written = 0;
    trace_lines     lines;
    fail_call(call::writev, 1, EINTR, 60);
    shorten_write(call::writev, 61, 4);
    before_call(call::writev, 61, [] { fail_call(call::writev, 1, EINTR, 60); });
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_SYSTEM_CALL);
    EXPECT_EQ(written, 4u);
    EXPECT_EQ(calls_made(call::writev), 102u) << "60, the partial one, and 41 more";
}

TEST_F(writing_files, no_retry_leaves_no_line)
{
    vector_of_three v;
    kt_uint32_t     written = 0;
    trace_lines     lines;
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), 0);
    fail_call(call::writev, 1, EIO);
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_SYSTEM_CALL);
    EXPECT_TRUE(lines.with("DV|RET|").empty());
}

TEST_F(writing_files, a_call_that_writes_nothing_is_not_repeated_without_end)
{
    don_t_sleep();
    vector_of_three       v;
    kt_uint32_t           written      = 0;
    std::function<void()> shorten_next = [&] {
        shorten_write(call::writev, 0, 0); // the call that this runs ahead of
        before_call(call::writev, 1, shorten_next);
    };
    before_call(call::writev, 1, shorten_next);
    EXPECT_EQ(rg_i_writev(fd, v.elements, 3, 9, &written), RG_E_SYSTEM_CALL);
    EXPECT_EQ(calls_made(call::writev), 101u);
}

TEST_F(writing_files, each_way_out_of_a_retried_call_has_a_number_of_its_own)
{
    don_t_sleep();
    trace_lines                lines;
    std::map<std::string, int> sites;
    kt_uint32_t                written = 0;
    const auto                 site    = [&](const char * what) {
        const auto left = lines.with("DV|RET|");
        ASSERT_FALSE(left.empty()) << what;
        EXPECT_EQ(sites[trace_lines::field(left.back(), 2)]++, 0) << what;
    };
    const auto interrupted_then = [&](call which, int the_errno) {
        fail_call(which, 1, EINTR);
        if (the_errno != 0)
            before_call(which, 2, [=] { fail_call(which, 0, the_errno); });
    };
    char word[] = "wxyz";
    for (const int the_errno : {0, ENOSPC, EIO}) {
        vector_of_three v;
        interrupted_then(call::writev, the_errno);
        (void)rg_i_writev(fd, v.elements, 3, 9, &written);
        site("writev");
        interrupted_then(call::write, the_errno);
        (void)rg_i_write(fd, word, 4);
        site("write");
        interrupted_then(call::fsync, the_errno);
        (void)rg_i_fdatasync(fd);
        site("fsync");
    }
    for (const int the_errno : {0, EACCES}) {
        interrupted_then(call::open, the_errno);
        const int opened = rg_i_open_file(dir.file("f").c_str(), O_RDONLY, 0);
        site("open");
        if (opened >= 0)
            ::close(opened);
    }
    EXPECT_EQ(sites.size(), 11u);
}

TEST_F(writing_whole_buffers, short_writes_go_on_at_every_length)
{
    std::string buffer = "abcdefghi";
    for (size_t shortened = 1; shortened < buffer.size(); ++shortened) {
        ASSERT_EQ(lseek(fd, 0, SEEK_SET), 0);
        shorten_write(call::write, 1, shortened);
        EXPECT_EQ(rg_i_write(fd, buffer.data(), buffer.size()), 0);
        EXPECT_EQ(content(), buffer);
    }
}

TEST_F(writing_whole_buffers, failures_are_those_of_the_vector_under_the_name_write)
{
    don_t_sleep();
    std::string buffer = "abc";
    ku_set_no_error_1();
    fail_call(call::write, 1, ENOSPC);
    EXPECT_EQ(rg_i_write(fd, buffer.data(), 3), RG_E_FILESYSTEM_FULL_DETAIL);
    EXPECT_EQ(error_code(), 0);
    fail_call(call::write, 1, EIO);
    EXPECT_EQ(rg_i_write(fd, buffer.data(), 3), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The write system call"), std::string::npos);
    fail_call(call::write, 1, EINTR, 100);
    EXPECT_EQ(rg_i_write(fd, buffer.data(), 3), 0);
    fail_call(call::write, 1, EINTR, 101);
    EXPECT_EQ(rg_i_write(fd, buffer.data(), 3), RG_E_SYSTEM_CALL);
}

TEST_F(opening_files, a_descriptor_is_not_inherited_across_exec)
{
    const int opened = rg_i_open_file(dir.file("f").c_str(), O_RDONLY, 0);
    ASSERT_GE(opened, 0);
    EXPECT_NE(fcntl(opened, F_GETFD) & FD_CLOEXEC, 0);
    const std::string command = "test ! -e /proc/self/fd/" + std::to_string(opened);
    EXPECT_EQ(std::system(command.c_str()), 0);
    ::close(opened);
}

TEST_F(opening_files, a_failure_gives_the_errno_of_open_and_no_record)
{
    ku_set_no_error_1();
    EXPECT_EQ(rg_i_open_file(dir.file("absent").c_str(), O_RDONLY, 0), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(calls_made(call::open), 1u);
}

TEST_F(opening_files, interruptions_are_retried_a_hundred_times)
{
    don_t_sleep();
    fail_call(call::open, 1, EINTR, 100);
    const int opened = rg_i_open_file(dir.file("f").c_str(), O_RDONLY, 0);
    EXPECT_GE(opened, 0);
    ::close(opened);
    fail_call(call::open, 1, EINTR, 101);
    EXPECT_EQ(rg_i_open_file(dir.file("f").c_str(), O_RDONLY, 0), -1);
    EXPECT_EQ(errno, EINTR);
}

TEST_F(syncing_files, a_closed_descriptor_gives_10_under_the_name_fdatasync_and_leaves_a_witness)
{
    const int gone = dup(fd);
    ::close(gone);
    EXPECT_EQ(rg_i_fdatasync(gone), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The fdatasync system call unexpectedly returned an errno of " + std::to_string(EBADF)),
              std::string::npos)
        << error_text();
    ASSERT_TRUE(file_exists(here.witness()));
    const bytes left = read_file(here.witness());
    EXPECT_EQ(std::string(left.begin(), left.end()).rfind("function(fdatasync) errno(9) line(", 0), 0u);
}

TEST_F(syncing_files, each_failed_attempt_leaves_its_witness_also_an_interrupted_one)
{
    don_t_sleep();
    fail_call(call::fsync, 1, EINTR);
    EXPECT_EQ(rg_i_fdatasync(fd), 0);
    EXPECT_TRUE(file_exists(here.witness()));
    const bytes left = read_file(here.witness());
    EXPECT_NE(std::string(left.begin(), left.end()).find("errno(4)"), std::string::npos);
}

TEST_F(syncing_files, a_full_file_system_gives_16_without_a_record)
{
    ku_set_no_error_1();
    fail_call(call::fsync, 1, ENOSPC);
    EXPECT_EQ(rg_i_fdatasync(fd), RG_E_FILESYSTEM_FULL_DETAIL);
    EXPECT_EQ(error_code(), 0);
    EXPECT_TRUE(file_exists(here.witness()));
}

TEST_F(syncing_files, the_call_made_is_fsync_and_a_success_leaves_nothing)
{
    EXPECT_EQ(rg_i_fdatasync(fd), 0);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_FALSE(file_exists(here.witness()));
}

TEST_F(syncing_files, a_persistent_interruption_gives_10_after_a_hundred_and_one_calls)
{
    don_t_sleep();
    fail_call(call::fsync, 1, EINTR, for_good);
    EXPECT_EQ(rg_i_fdatasync(fd), RG_E_SYSTEM_CALL);
    EXPECT_EQ(calls_made(call::fsync), 101u);
}
