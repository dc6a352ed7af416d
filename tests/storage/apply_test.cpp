// SPDX-License-Identifier: MIT
// Apply: what goes to the file, in how many calls, and what every fault on the way leaves.
#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicitly = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

struct applying : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    // A table of three committed rows, opened from its file, with room for transactions of the caller's.
    rg_opaque_handle_t opened_with_rows()
    {
        rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        return r.open(explicitly);
    }
    // One of each: an added, an updated and a deleted row.
    static void change(rg_opaque_handle_t table)
    {
        EXPECT_EQ(add(table, 4, 40), 0);
        EXPECT_EQ(set(table, 1, 10), 0);
        EXPECT_EQ(remove(table, 2), 0);
    }
    static inline const file_state committed{0, 4, {{1, 1}, {2, 2}, {3, 3}}};
    static inline const file_state changed{0, 5, {{1, 10}, {3, 3}, {4, 40}}};

    // The live commit record and all ahead of it are what they were; a reader sees the same.
    void expect_file_unchanged(const bytes & before)
    {
        const bytes now = read_file(r.path);
        ASSERT_GE(now.size(), before.size());
        EXPECT_TRUE(std::equal(before.begin(), before.end(), now.begin()));
        EXPECT_EQ(state_in(r.dir.path()), committed);
    }
    // After a failure the same transaction goes through.
    void expect_retry_works(rg_opaque_handle_t table)
    {
        reset_calls();
        EXPECT_EQ(rg_apply_1(table, 0), 0) << error_text();
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(r.dir.path()), changed);
    }
};

struct applying_by_rewriting : applying {
    kt_int32_t apply(rg_opaque_handle_t table) { return rg_i_apply(&object(table), 1, 0); }
    void       expect_rewrite_works(rg_opaque_handle_t table)
    {
        reset_calls();
        EXPECT_EQ(apply(table), 0) << error_text();
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(r.dir.path()), changed);
    }
};

struct the_rewrite_rule : testing::Test {
    static kt_uint32_t due(kt_uint32_t file_length, kt_uint32_t used_bytes)
    {
        rg_i_table_t table                  = {};
        table.file_length                   = file_length;
        table.record_buffer_pool.used_bytes = used_bytes;
        return rg_i_rewrite_is_due(&table);
    }
};

} // namespace

TEST_F(the_rewrite_rule, leaves_files_of_up_to_16384_bytes_alone)
{
    EXPECT_EQ(due(0, 0), 0u);
    EXPECT_EQ(due(16384, 1), 0u);
    EXPECT_EQ(due(16385, 1), 1u);
    EXPECT_EQ(due(16385, 8192), 1u);
}

TEST_F(the_rewrite_rule, truncates_the_quotient_so_that_49_9_percent_rewrites_and_50_does_not)
{
    EXPECT_EQ(due(20000, 9999), 1u);
    EXPECT_EQ(due(20000, 10000), 0u);
    EXPECT_EQ(due(20000, 20000), 0u);
}

TEST_F(the_rewrite_rule, wraps_its_product_at_32_bits)
{
    EXPECT_EQ(due(42949672, 42949672), 0u);
    EXPECT_EQ(due(42949673, 42949673), 1u) << "all of it is live, and the product is 4";
}

TEST_F(applying, syncs_once_and_shows_nothing_to_a_reader)
{
    rg_opaque_handle_t table  = opened_with_rows();
    const bytes        before = read_file(r.path);
    change(table);
    reset_calls();
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_EQ(calls_made(call::writev), 1u);
    EXPECT_EQ(calls_made(call::write), 0u);
    EXPECT_EQ(object(table).ready_for_commit, 1u);
    expect_file_unchanged(before);
    // Two rows in the order of their first change, the deletion, and a commit record that is live too.
    file_image expected(before);
    expected.row(0, 4, 40);
    expected.row(115, 1, 10);
    expected.deleted_rows({171});
    const std::uint32_t commit_offset = expected.commit(5);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(expected.content()));
    EXPECT_EQ(object(table).disk_applied_commit_record_offset, commit_offset);
    EXPECT_EQ(object(table).disk_applied_commit_record_length, 24u);
    EXPECT_EQ(object(table).disk_file_length, expected.size());
    EXPECT_EQ(object(table).change_counter, 4u);
    EXPECT_EQ(object(table).applied_change_counter, 5u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), changed);
}

TEST_F(applying, an_implicit_update_makes_exactly_two_syncs)
{
    rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
    reset_calls();
    EXPECT_EQ(add(table, 1, 1), 0);
    EXPECT_EQ(calls_made(call::fsync), 2u);
    EXPECT_EQ(calls_made(call::writev), 1u);
    EXPECT_EQ(calls_made(call::write), 1u);
    reset_calls();
    EXPECT_EQ(set(table, 1, 2), 0);
    EXPECT_EQ(calls_made(call::fsync), 2u);
    reset_calls();
    EXPECT_EQ(remove(table, 1), 0);
    EXPECT_EQ(calls_made(call::fsync), 2u);
}

TEST_F(applying, writes_16_records_with_the_first_call_and_64_kib_with_each_further_one)
{
    // 15 rows and the commit record are 16; one row more makes a second call. Some 2,000 rows of 32 bytes and a few more fill a further one.
    for (const auto & [row_count, calls] :
         {std::pair{15u, 1u}, {16u, 2u}, {31u, 2u}, {100u, 2u}, {16u + 1900u, 2u}, {16u + 2100u, 3u}}) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(explicitly);
        for (std::uint32_t id = 0; id < row_count; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        reset_calls();
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(calls_made(call::writev), calls) << row_count;
        EXPECT_LE(longest_writev(), 16);
        EXPECT_EQ(calls_made(call::fsync), 1u);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()).rows.size(), row_count);
    }
}

TEST_F(applying, writes_the_deletions_out_with_16_records_queued_and_the_commit_record_by_itself)
{
    rg_opaque_handle_t table = opened_with_rows();
    for (std::uint32_t id = 10; id < 25; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(remove(table, 2), 0);
    reset_calls();
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(calls_made(call::writev), 2u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).rows.size(), 17u);
}

TEST_F(applying, nothing_still_writes_a_commit_record_and_advances_the_counter)
{
    rg_opaque_handle_t table = opened_with_rows();
    file_image         expected(read_file(r.path));
    expected.commit(5);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(read_file(r.path), expected.content());
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).change_counter, 5u);
}

TEST_F(applying, leaves_out_a_row_that_was_added_and_deleted)
{
    rg_opaque_handle_t table = opened_with_rows();
    file_image         expected(read_file(r.path));
    expected.commit(5);
    EXPECT_EQ(add(table, 9, 9), 0);
    EXPECT_EQ(remove(table, 9), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(expected.content())) << "and makes no deleted-rows record for it";
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(rows_of(table), (rows{{1, 1}, {2, 2}, {3, 3}}));
}

TEST_F(applying, names_the_committed_version_of_a_row_that_was_updated_and_deleted)
{
    rg_opaque_handle_t table = opened_with_rows();
    file_image         expected(read_file(r.path));
    expected.deleted_rows({171});
    expected.commit(5);
    EXPECT_EQ(set(table, 2, 99), 0);
    EXPECT_EQ(remove(table, 2), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(expected.content()));
    EXPECT_EQ(rg_commit_1(table), 0);
}

TEST_F(applying, takes_the_callers_counter_also_if_it_is_lower)
{
    rg_opaque_handle_t table = opened_with_rows();
    EXPECT_EQ(rg_apply_1(table, 1000), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).change_counter, 1000u);
    EXPECT_EQ(rg_apply_1(table, 2), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()).change_counter, 2u);
}

TEST_F(applying, under_implicit_control_ignores_the_callers_counter)
{
    rg_opaque_handle_t table = r.create(RG_MODE_WRITE);
    EXPECT_EQ(rg_apply_1(table, 1000), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(object(table).change_counter, 2u);
}

TEST_F(applying, twice_gives_212_and_changes_nothing)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    const bytes before = read_file(r.path);
    EXPECT_EQ(rg_apply_1(table, 77), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(error_code(), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(object(table).applied_change_counter, 5u);
    EXPECT_EQ(read_file(r.path), before);
    EXPECT_EQ(add(table, 8, 8), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(set(table, 1, 8), RG_E_APPLIED_UNCOMMITTED);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), changed);
}

TEST_F(applying, a_transient_table_changes_its_state_alone)
{
    rg_opaque_handle_t table = create_table(r.tree, "/transient", example_columns(), explicitly);
    EXPECT_EQ(add(table, 1, 1), 0);
    reset_calls();
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object(table).ready_for_commit, 1u);
    EXPECT_EQ(calls_made(call::allocation), 0u);
    EXPECT_EQ(calls_made(call::writev), 0u);
    EXPECT_NE(object(table).p_rows_change_list, nullptr);
    EXPECT_EQ(rg_commit_1(table), 0);
}

TEST_F(applying, writes_over_dead_bytes_from_the_same_offset_and_leaves_what_is_behind)
{
    rg_opaque_handle_t table  = opened_with_rows();
    const bytes        before = read_file(r.path);
    change(table);
    fail_call(call::fsync, 1, EIO);
    EXPECT_EQ(rg_apply_1(table, 0), RG_E_SYSTEM_CALL);
    const bytes with_dead_bytes = read_file(r.path);
    EXPECT_GT(with_dead_bytes.size(), before.size());
    EXPECT_EQ(object(table).ready_for_commit, 0u);
    EXPECT_EQ(rg_abort_1(table), 0); // nothing was applied, so nothing is cut
    EXPECT_EQ(read_file(r.path), with_dead_bytes);

    EXPECT_EQ(add(table, 9, 9), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    const bytes after = read_file(r.path);
    EXPECT_EQ(after.size(), with_dead_bytes.size()) << "shorter than what failed: its tail stays";
    file_image expected(before);
    expected.at(static_cast<std::uint32_t>(before.size()) - 24 + 8, 0);
    expected.row(0, 9, 9);
    expected.commit(5);
    EXPECT_TRUE(std::equal(expected.content().begin(), expected.content().end(), after.begin()));
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 5, {{1, 1}, {2, 2}, {3, 3}, {9, 9}}}));
}

TEST_F(applying, reports_each_fault_of_an_append_and_leaves_the_table_as_it_was)
{
    struct fault {
        call       which;
        int        the_errno;
        kt_int32_t code;
    };
    for (const fault & f : {fault{call::lseek, EIO, RG_E_SYSTEM_CALL},
                            {call::writev, EIO, RG_E_SYSTEM_CALL},
                            {call::writev, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL},
                            {call::writev, EDQUOT, RG_E_SYSTEM_CALL},
                            {call::fsync, EIO, RG_E_SYSTEM_CALL},
                            {call::fsync, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}}) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        table                    = other.open(explicitly);
        const bytes  before      = read_file(other.path);
        const size_t descriptors = open_descriptors();
        change(table);
        reset_calls();
        fail_call(f.which, 1, f.the_errno);
        EXPECT_EQ(rg_apply_1(table, 0), f.code);
        EXPECT_EQ(error_code(), f.code);
        EXPECT_EQ(object(table).ready_for_commit, 0u);
        EXPECT_EQ(open_descriptors(), descriptors);
        EXPECT_STREQ(object(table).p_file_path, other.rewrite.c_str()) << "the path buffer is left at the rewrite name";
        EXPECT_EQ(state_in(other.dir.path()), committed);
        EXPECT_EQ(object(table).total_applied_rows, 4u) << "the changes are still pending";
        EXPECT_NE(object(table).p_rows_change_list, nullptr);
        reset_calls();
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), changed);
    }
}

TEST_F(applying, reports_a_fault_of_each_of_several_writes)
{
    constexpr std::uint32_t row_count = 16 + 2 * 2100;
    for (unsigned nth = 1; nth <= 4; ++nth) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(explicitly);
        for (std::uint32_t id = 0; id < row_count; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        reset_calls();
        fail_call(call::writev, nth, EIO);
        EXPECT_EQ(rg_apply_1(table, 0), RG_E_SYSTEM_CALL);
        EXPECT_EQ(calls_made(call::writev), nth);
        EXPECT_EQ(state_in(other.dir.path()), (file_state{0, 1, {}}));
        reset_calls();
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()).rows.size(), row_count);
    }
}

TEST_F(applying, survives_short_writes_of_every_length)
{
    for (size_t length = 1; length < 32 + 32 + 20 + 24; ++length) {
        registry_at other;
        write_file(other.path, [] {
            file_image image;
            image.row(0, 1, 1);
            image.row(0, 2, 2);
            image.row(0, 3, 3);
            image.commit(4);
            return image.content();
        }());
        rg_opaque_handle_t table = other.open(explicitly);
        change(table);
        reset_calls();
        shorten_write(call::writev, 1, length);
        EXPECT_EQ(rg_apply_1(table, 0), 0) << length;
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), changed) << length;
    }
}

TEST_F(applying, goes_on_in_the_middle_of_many_records_after_a_short_write)
{
    constexpr std::uint32_t row_count = 16 + 2100;
    for (const size_t length : {1u, 31u, 32u, 33u, 40'000u, 65'535u}) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(explicitly);
        file_state         expected{0, 2, {}};
        for (std::uint32_t id = 0; id < row_count; ++id) {
            EXPECT_EQ(add(table, id, id * 3), 0);
            expected.rows[id] = id * 3;
        }
        reset_calls();
        shorten_write(call::writev, 2, length);
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), expected) << length;
    }
}

TEST_F(applying, gives_12_for_each_failed_allocation_and_leaves_the_table_as_it_was)
{
    // The commit record, the row buffer and the deleted-rows record.
    for (unsigned nth = 1; nth <= 3; ++nth) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        table = other.open(explicitly);
        change(table);
        write_file(other.rewrite, {1});
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(rg_apply_1(table, 0), RG_E_NO_MEMORY) << nth;
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_EQ(object(table).ready_for_commit, 0u);
        EXPECT_EQ(file_exists(other.rewrite), nth != 2) << "only a failed row buffer takes a stale rewrite file away";
        EXPECT_EQ(state_in(other.dir.path()), committed);
        reset_calls();
        EXPECT_EQ(rg_apply_1(table, 0), 0);
        EXPECT_EQ(calls_made(call::allocation), 3u) << "one apply allocates three buffers at most";
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), changed);
    }
}

TEST_F(applying, beyond_4_gib_gives_efbig_as_writev_and_changes_nothing)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    const bytes before = read_file(r.path);
    // As it would stand at the end of a very long file.
    rg_i_table_t &    t      = object(table);
    const kt_uint32_t offset = std::exchange(t.disk_commit_record_offset, 0xFFFFFFFFu - 24 - (32 + 32 + 20 + 24) + 1);
    reset_calls();
    EXPECT_EQ(rg_apply_1(table, 0), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("The writev system call unexpectedly returned an errno of " + std::to_string(EFBIG)),
              std::string::npos)
        << error_text();
    EXPECT_EQ(calls_made(call::writev), 0u);
    EXPECT_EQ(t.ready_for_commit, 0u);
    EXPECT_EQ(+t.p_rows_change_list->p_index_entry->applied_file_offset, 0u);
    EXPECT_EQ(read_file(r.path), before);
    t.disk_commit_record_offset = offset;
    expect_retry_works(table);
}

TEST_F(applying, up_to_4_gib_less_a_byte_works)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    rg_i_table_t &    t      = object(table);
    const kt_uint32_t offset = std::exchange(t.disk_commit_record_offset, 0xFFFFFFFFu - 24 - (32 + 32 + 20 + 24));
    EXPECT_EQ(rg_apply_1(table, 0), 0); // sparse
    EXPECT_EQ(t.disk_file_length, 0xFFFFFFFFu);
    EXPECT_EQ(std::filesystem::file_size(r.path), 0xFFFFFFFFu);
    t.disk_commit_record_offset = offset;
}

TEST_F(applying, on_a_table_open_for_reading_gives_206)
{
    EXPECT_EQ(rg_close_table_1(opened_with_rows()), 0);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(rg_apply_1(table, 0), RG_E_ACCESS);
    EXPECT_EQ(rg_commit_1(table), RG_E_ACCESS);
    EXPECT_EQ(rg_abort_1(table), RG_E_ACCESS);
    EXPECT_EQ(error_code(), RG_E_ACCESS);
}

TEST_F(applying, no_table_gives_100)
{
    EXPECT_EQ(rg_apply_1(nullptr, 0), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_commit_1(nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_abort_1(nullptr), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
}

TEST_F(applying, clears_the_error_record_on_success)
{
    rg_opaque_handle_t table = opened_with_rows();
    EXPECT_EQ(rg_apply_1(nullptr, 0), RG_E_INVALID_HANDLE);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(error_code(), 0);
}

TEST_F(applying, in_a_forked_child_gives_15_without_a_record)
{
    rg_opaque_handle_t table = opened_with_rows();
    ForkChildHandler();
    EXPECT_EQ(rg_apply_1(nullptr, 0), RG_E_INTERNAL);
    EXPECT_EQ(rg_apply_1(table, 0), RG_E_INTERNAL);
    EXPECT_EQ(rg_commit_1(table), RG_E_INTERNAL);
    EXPECT_EQ(rg_abort_1(table), RG_E_INTERNAL);
    EXPECT_EQ(error_code(), 0);
    In_Child_Process = 0;
}

TEST_F(applying, leaves_one_line_at_each_way_out_with_a_number_of_its_own)
{
    std::map<std::string, int> sites;
    const auto                 line_of = [&](rg_opaque_handle_t table, kt_uint32_t rewrite) {
        trace_lines lines;
        (void)rg_i_apply(&object(table), rewrite, 0);
        const auto left = lines.with("DV|APP|");
        EXPECT_EQ(left.size(), 1u);
        return left.empty() ? std::string() : left[0];
    };
    const auto site = [&](const std::string & line) { EXPECT_EQ(sites[trace_lines::field(line, 2)]++, 0) << line; };
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    for (const kt_uint32_t rewrite : {0u, 1u}) {
        for (const call which : {call::lseek, call::lockf, call::writev, call::fsync}) {
            if (which == (rewrite != 0 ? call::lseek : call::lockf))
                continue;
            fail_call(which, 1, EIO);
            site(line_of(table, rewrite));
        }
        for (unsigned nth = 2; nth <= 3; ++nth) {
            fail_call(call::allocation, nth, ENOMEM);
            site(line_of(table, rewrite));
        }
    }
    for (const int the_errno : {EACCES, ENOSPC, EIO}) {
        fail_call(call::open, 1, the_errno);
        site(line_of(table, 1));
    }
    fail_call(call::allocation, 1, ENOMEM);
    site(line_of(table, 0));

    const std::string success = line_of(table, 0);
    site(success);
    const rg_i_table_t & t = object(table);
    char                 expected[200];
    std::snprintf(expected, sizeof expected, "DV|APP|%s|%x|1|%u|%u|%u|0|%d|-1|0",
                  trace_lines::field(success, 2).c_str(), static_cast<unsigned>(reinterpret_cast<uintptr_t>(&t)),
                  t.disk_commit_record_offset, t.disk_applied_commit_record_offset, t.file_length, t.file_fd);
    EXPECT_EQ(success, expected);
    EXPECT_GE(trace_lines::field(success, 2).size(), 3u);
    site(line_of(table, 0)); // applied already
}

// ---- Rewriting ----

TEST_F(applying_by_rewriting, writes_the_table_whole_and_leaves_the_old_file_alone)
{
    rg_opaque_handle_t table  = opened_with_rows();
    const bytes        before = read_file(r.path);
    change(table);
    reset_calls();
    EXPECT_EQ(apply(table), 0);
    EXPECT_EQ(calls_made(call::fsync), 1u);
    EXPECT_EQ(calls_made(call::writev), 1u);
    EXPECT_EQ(calls_made(call::lockf), 1u);
    EXPECT_EQ(object(table).ready_for_commit, 2u);
    EXPECT_EQ(read_file(r.path), before);

    file_image expected;
    expected.row(0, 1, 10);
    expected.row(0, 3, 3);
    expected.row(0, 4, 40);
    const std::uint32_t commit_offset = expected.commit(5);
    EXPECT_EQ(to_hex(read_file(r.rewrite)), to_hex(expected.content()));
    EXPECT_EQ(object(table).disk_applied_commit_record_offset, commit_offset);
    EXPECT_EQ(object(table).rewrite_file_length, expected.size());
    EXPECT_GE(object(table).rewrite_file_fd, 0);
    EXPECT_EQ(state_in(r.dir.path()), committed);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(read_file(r.path), expected.content());
}

TEST_F(applying_by_rewriting, fourteen_rows_take_one_write_and_fifteen_two)
{
    for (const auto & [row_count, calls] :
         {std::pair{14u, 1u}, {15u, 2u}, {30u, 2u}, {31u, 2u}, {15u + 1900u, 2u}, {15u + 2100u, 3u}}) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(explicitly);
        for (std::uint32_t id = 0; id < row_count; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        reset_calls();
        EXPECT_EQ(apply(table), 0);
        EXPECT_EQ(calls_made(call::writev), calls) << row_count;
        EXPECT_LE(longest_writev(), 16);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()).rows.size(), row_count);
    }
}

TEST_F(applying_by_rewriting, does_not_truncate_an_older_rewrite_file)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    write_file(r.rewrite, bytes(5000, 0xEE));
    EXPECT_EQ(apply(table), 0);
    EXPECT_EQ(read_file(r.rewrite).size(), 5000u);
    EXPECT_LT(object(table).rewrite_file_length, 5000u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), changed) << "nobody reads behind the new commit record";
}

TEST_F(applying_by_rewriting, is_chosen_for_a_long_table_that_is_less_than_half_alive)
{
    rg_opaque_handle_t table = r.create(explicitly);
    for (std::uint32_t id = 0; id < 600; ++id)
        EXPECT_EQ(add(table, id, id), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    table = r.open(explicitly);
    EXPECT_GT(object(table).file_length, 16384u);
    for (std::uint32_t id = 0; id < 599; ++id)
        EXPECT_EQ(rg_delete_row_by_index_1(table, id), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object(table).ready_for_commit, 1u) << "deleted rows count as used until they are committed";
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(object(table).ready_for_commit, 2u);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(read_file(r.path).size(), 91u + 32 + 24);
    EXPECT_EQ(object(table).file_length, 91u + 32 + 24);
    EXPECT_EQ(rows_of(table), (rows{{599, 599}}));
}

TEST_F(applying_by_rewriting, reports_each_fault_and_removes_the_rewrite_file)
{
    struct fault {
        call       which;
        int        the_errno;
        kt_int32_t code;
    };
    for (const fault & f : {fault{call::lockf, EDEADLK, RG_E_SYSTEM_CALL},
                            {call::writev, EIO, RG_E_SYSTEM_CALL},
                            {call::writev, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL},
                            {call::fsync, EIO, RG_E_SYSTEM_CALL},
                            {call::fsync, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}}) {
        registry_at        other;
        rg_opaque_handle_t table = other.create(RG_MODE_WRITE);
        for (std::uint32_t id = 1; id <= 3; ++id)
            EXPECT_EQ(add(table, id, id), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
        table                    = other.open(explicitly);
        const bytes  before      = read_file(other.path);
        const size_t descriptors = open_descriptors();
        change(table);
        reset_calls();
        fail_call(f.which, 1, f.the_errno);
        EXPECT_EQ(apply(table), f.code);
        EXPECT_EQ(error_code(), f.code);
        EXPECT_EQ(object(table).ready_for_commit, 0u);
        EXPECT_EQ(object(table).rewrite_file_fd, -1);
        EXPECT_EQ(open_descriptors(), descriptors);
        EXPECT_FALSE(file_exists(other.rewrite));
        EXPECT_STREQ(object(table).p_file_path, other.rewrite.c_str());
        EXPECT_EQ(read_file(other.path), before);
        reset_calls();
        EXPECT_EQ(apply(table), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        EXPECT_EQ(state_in(other.dir.path()), changed);
    }
}

TEST_F(applying_by_rewriting, maps_the_errno_of_open_and_removes_nothing)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    for (const auto & [the_errno, code] :
         {std::pair{EACCES, RG_E_ACCESS}, {ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL}, {EMFILE, RG_E_SYSTEM_CALL}}) {
        write_file(r.rewrite, {1});
        fail_call(call::open, 1, the_errno);
        EXPECT_EQ(apply(table), code);
        EXPECT_EQ(error_code(), code);
        EXPECT_TRUE(file_exists(r.rewrite));
        EXPECT_EQ(object(table).ready_for_commit, 0u);
    }
    expect_rewrite_works(table);
}

TEST_F(applying_by_rewriting, gives_12_for_each_failed_allocation_and_removes_the_rewrite_file)
{
    rg_opaque_handle_t table  = opened_with_rows();
    const bytes        before = read_file(r.path);
    change(table);
    for (unsigned nth = 1; nth <= 3; ++nth) {
        const size_t descriptors = open_descriptors();
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        EXPECT_EQ(apply(table), RG_E_NO_MEMORY) << nth;
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_FALSE(file_exists(r.rewrite));
        EXPECT_EQ(open_descriptors(), descriptors);
        EXPECT_EQ(read_file(r.path), before);
    }
    expect_rewrite_works(table);
}

TEST_F(applying_by_rewriting, survives_short_writes_of_every_length)
{
    rg_opaque_handle_t table = opened_with_rows();
    change(table);
    for (size_t length = 1; length < 91 + 3 * 32 + 24; ++length) {
        reset_calls();
        shorten_write(call::writev, 1, length);
        EXPECT_EQ(apply(table), 0);
        EXPECT_EQ(state_of_bytes(read_file(r.rewrite)), changed) << length;
        object(table).ready_for_commit = 0; // as if it had not been
        ::close(std::exchange(object(table).rewrite_file_fd, -1));
    }
    expect_rewrite_works(table);
}
