// SPDX-License-Identifier: MIT
// Creating table files: whole or not at all.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

const bytes new_table = from_hex("5b 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00"
                                 "00 00 00 00 02 00 00 00 00 00 00 00 00 00 00 00"
                                 "03 00 00 00 03 00 00 00 00 00 00 00 00 00 00 00"
                                 "00 00 00 00 00 00 00 00 03 00 00 00 04 00 00 00"
                                 "02 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00"
                                 "00 00 00 00 69 64 00 76 61 6c 00 18 00 00 00 00"
                                 "00 00 00 ff ff ff ff 08 00 00 00 01 00 00 00 00"
                                 "00 00 00");

struct creating_a_table_file : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    kt_int32_t try_create()
    {
        kt_int32_t         rc    = 0;
        rg_opaque_handle_t table = create_table(r.tree, "/r/t", example_columns(), RG_MODE_WRITE, &rc);
        if (table != nullptr) {
            EXPECT_EQ(rg_close_table_1(table), 0);
        }
        return rc;
    }
    // A creation that fails leaves nothing behind and nothing open; the next one works.
    void expect_refusal(kt_int32_t code, bool rewrite_file_stays = false)
    {
        const size_t descriptors = open_descriptors();
        EXPECT_EQ(try_create(), code);
        EXPECT_EQ(error_code(), code);
        EXPECT_FALSE(file_exists(r.path));
        EXPECT_EQ(file_exists(r.rewrite), rewrite_file_stays);
        EXPECT_EQ(open_descriptors(), descriptors);
        reset_calls();
        EXPECT_EQ(try_create(), 0) << error_text();
        EXPECT_EQ(read_file(r.path), new_table);
        std::filesystem::remove(r.path);
    }
};

} // namespace

TEST_F(creating_a_table_file, gives_the_file_whole_with_one_write_one_sync_and_one_rename)
{
    reset_calls();
    rg_opaque_handle_t table = r.create();
    EXPECT_EQ(calls_made(call::writev), 1u);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_EQ(calls_made(call::rename), 1u);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(new_table));
    EXPECT_FALSE(file_exists(r.rewrite));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(creating_a_table_file, starts_with_counter_1_and_a_commit_record_of_24_bytes)
{
    const rg_i_table_t & table = object(r.create());
    EXPECT_EQ(table.change_counter, 1u);
    EXPECT_EQ(table.disk_commit_record_offset, 91u);
    EXPECT_EQ(table.disk_commit_record_length, 24u);
    EXPECT_EQ(table.file_length, 115u);
    EXPECT_EQ(table.commit_record_offset, 0u);
    EXPECT_EQ(table.commit_record_length, 0u);
    EXPECT_EQ(table.disk_file_length, 0u);
    EXPECT_GE(table.file_fd, 0);
    EXPECT_EQ(table.rewrite_file_fd, -1);
    EXPECT_STREQ(table.p_file_path, r.path.c_str());
    EXPECT_STREQ(table.p_name, r.path.c_str());
    EXPECT_STREQ(table.p_persistent_table_registry_path, "/r/t");
    EXPECT_EQ(table.block_size, 512u);
}

TEST_F(creating_a_table_file, makes_a_file_of_mode_0644)
{
    const mode_t former = umask(0);
    EXPECT_EQ(try_create(), 0);
    umask(former);
    struct stat status;
    ASSERT_EQ(stat(r.path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0644u);
}

TEST_F(creating_a_table_file, takes_a_stray_rewrite_file_of_any_length_over)
{
    for (const size_t length : {0u, 1u, 114u, 115u, 116u, 5000u}) {
        write_file(r.rewrite, bytes(length, 0xff));
        EXPECT_EQ(try_create(), 0);
        const bytes content = read_file(r.path);
        EXPECT_EQ(content.size(), std::max<size_t>(length, 115));
        EXPECT_TRUE(std::equal(new_table.begin(), new_table.end(), content.begin()));
        EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 1, {}}));
        std::filesystem::remove(r.path);
    }
}

TEST_F(creating_a_table_file, refuses_a_file_that_comes_into_being_meanwhile_and_leaves_it_alone)
{
    const bytes other(77, 0x55);
    before_call(call::lockf, 1, [&] { write_file(r.path, other); });
    EXPECT_EQ(try_create(), RG_E_TABLE_EXISTS);
    EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
    EXPECT_EQ(read_file(r.path), other);
    EXPECT_FALSE(file_exists(r.rewrite));
}

TEST_F(creating_a_table_file, lets_any_failure_of_the_second_stat_pass)
{
    fail_call(call::stat, 2, EIO);
    EXPECT_EQ(try_create(), 0);
    EXPECT_TRUE(failed_as_asked(call::stat));
    EXPECT_EQ(read_file(r.path), new_table);
}

TEST_F(creating_a_table_file, in_a_directory_that_is_not_there_gives_10_open)
{
    temp_dir  other;
    open_tree tree;
    tree.mount("/gone", other.file("sub"));
    std::filesystem::remove(other.file("sub"));
    kt_int32_t rc = 0;
    EXPECT_EQ(create_table(tree, "/gone/t", example_columns(), RG_MODE_WRITE, &rc), nullptr);
    EXPECT_EQ(rc, RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The open system call unexpectedly returned an errno of 2"), std::string::npos)
        << error_text();
}

TEST_F(creating_a_table_file, maps_the_errno_of_open)
{
    fail_call(call::open, 1, EACCES);
    expect_refusal(RG_E_ACCESS);
    write_file(r.rewrite, {1});
    fail_call(call::open, 1, ENOSPC);
    expect_refusal(RG_E_FILESYSTEM_FULL_DETAIL); // and takes the rewrite file away
    write_file(r.rewrite, {1});
    fail_call(call::open, 1, EROFS);
    expect_refusal(RG_E_SYSTEM_CALL, true);
}

TEST_F(creating_a_table_file, takes_a_lock_that_is_held_for_a_creation_under_way)
{
    for (const int the_errno : {EACCES, EEXIST}) {
        fail_call(call::lockf, 1, the_errno);
        expect_refusal(RG_E_TABLE_EXISTS);
    }
}

TEST_F(creating_a_table_file, gives_10_for_a_lock_that_is_held_with_eagain)
{
    for (const int the_errno : {EAGAIN, EDEADLK, ENOLCK, EINTR}) {
        fail_call(call::lockf, 1, the_errno);
        expect_refusal(RG_E_SYSTEM_CALL);
    }
}

TEST_F(creating_a_table_file, reports_each_failure_of_writing_and_syncing)
{
    for (const auto & [the_errno, code] :
         {std::pair{ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}, {EIO, RG_E_SYSTEM_CALL}, {EDQUOT, RG_E_SYSTEM_CALL}}) {
        fail_call(call::writev, 1, the_errno);
        expect_refusal(code);
        fail_call(call::fsync, 1, the_errno);
        expect_refusal(code);
    }
}

TEST_F(creating_a_table_file, survives_short_writes_of_every_length)
{
    for (size_t length = 1; length < 115; ++length) {
        reset_calls();
        shorten_write(call::writev, 1, length);
        EXPECT_EQ(try_create(), 0);
        EXPECT_EQ(read_file(r.path), new_table) << length;
        std::filesystem::remove(r.path);
    }
}

TEST_F(creating_a_table_file, maps_the_errno_of_rename)
{
    fail_call(call::rename, 1, EACCES);
    expect_refusal(RG_E_ACCESS);
    fail_call(call::rename, 1, ENOSPC);
    expect_refusal(RG_E_FILESYSTEM_FULL_DETAIL);
    fail_call(call::rename, 1, EIO);
    expect_refusal(RG_E_SYSTEM_CALL);
}

TEST_F(creating_a_table_file, removes_the_target_too_when_rename_finds_no_space)
{
    before_call(call::rename, 1, [&] { write_file(r.path, {1, 2, 3}); });
    fail_call(call::rename, 1, ENOSPC);
    EXPECT_EQ(try_create(), RG_E_FILESYSTEM_FULL_DETAIL);
    EXPECT_FALSE(file_exists(r.path));
    EXPECT_FALSE(file_exists(r.rewrite));
}

TEST_F(creating_a_table_file, loses_to_one_that_removed_its_rewrite_file_with_10)
{
    before_call(call::rename, 1, [&] { std::filesystem::remove(r.rewrite); });
    EXPECT_EQ(try_create(), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The rename system call unexpectedly returned an errno of 2"), std::string::npos);
    EXPECT_FALSE(file_exists(r.path));
}

TEST_F(creating_a_table_file, ahead_of_the_rename_a_crash_leaves_no_table)
{
    for (const call which : {call::writev, call::fsync, call::rename}) {
        moment crash;
        before_call(which, 1, [&] { crash.take(r); });
        EXPECT_EQ(try_create(), 0);
        ASSERT_TRUE(crash.reached);
        EXPECT_EQ(crash.state(), (file_state{RG_E_NO_SUCH_TABLE, 0, {}}));
        std::filesystem::remove(r.path);
        // The next creation takes over what was left.
        write_file(r.rewrite, crash.rewrite.value());
        EXPECT_EQ(try_create(), 0);
        EXPECT_EQ(read_file(r.path), new_table);
        std::filesystem::remove(r.path);
    }
}

TEST_F(creating_a_table_file, gives_12_for_each_failed_allocation_and_leaves_nothing)
{
    for (unsigned nth = 1;; ++nth) {
        fail_call(call::allocation, nth, ENOMEM);
        const size_t descriptors = open_descriptors(); // allocates nothing of ours
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        kt_int32_t         rc      = 0;
        rg_opaque_handle_t table   = nullptr;
        auto               columns = example_columns();
        rc                         = rg_create_table_1(r.tree, text("/r/t"), columns.data(), 2, RG_MODE_WRITE, &table);
        const bool failed          = failed_as_asked(call::allocation);
        reset_calls();
        if (rc == 0 && !failed) {
            EXPECT_EQ(rg_close_table_1(table), 0);
            EXPECT_GT(nth, 8u);
            break;
        }
        if (rc == 0) { // a formatting of the trace or the like
            EXPECT_EQ(rg_close_table_1(table), 0);
            std::filesystem::remove(r.path);
            continue;
        }
        EXPECT_EQ(rc, RG_E_NO_MEMORY) << nth;
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY) << nth;
        EXPECT_EQ(open_descriptors(), descriptors) << nth;
        EXPECT_FALSE(file_exists(r.rewrite)) << nth;
        std::filesystem::remove(r.path); // the last one is that of the tree, behind the file
    }
}

TEST_F(creating_a_table_file, under_no_name_gives_101)
{
    rg_i_table_t * p_table = nullptr;
    auto           columns = example_columns();
    EXPECT_EQ(rg_i_create_persistent_table(nullptr, text("/r/t"), nullptr, columns.data(), 2, RG_MODE_WRITE, 512,
                                           nullptr, &p_table),
              RG_E_NULL_POINTER);
    EXPECT_EQ(error_code(), RG_E_NULL_POINTER);
    EXPECT_EQ(p_table, nullptr);
}

TEST_F(creating_a_table_file, holds_the_lock_of_the_new_file_until_the_table_is_closed)
{
    rg_opaque_handle_t table = r.create();
    // A lock excludes other processes only.
    const pid_t child = fork();
    if (child == 0) {
        const int fd = ::open(r.path.c_str(), O_RDWR);
        _exit(lockf(fd, F_TEST, 0) == 0 ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(creating_a_table_file, with_two_thousand_columns_gives_a_file_that_opens)
{
    std::vector<rg_column_t> columns = example_columns();
    for (int i = 0; i < 2000; ++i)
        columns.push_back(column("c" + std::to_string(i), KT_INT32));
    rg_opaque_handle_t table = create_table(r.tree, "/r/t", columns, RG_MODE_WRITE);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(r.try_open(), 0);
}
