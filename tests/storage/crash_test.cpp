// SPDX-License-Identifier: MIT
// What a crash leaves, at every call and with every part of a write: the old state or the new one, never else.
#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicitly = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

constexpr std::array disk_calls = {call::open,  call::lockf, call::lseek,  call::writev,
                                   call::write, call::fsync, call::rename, call::unlink};

struct after_a_crash : testing::Test {
    working_directory here;
    fault_scope       faults;

    static inline const file_state old_state{0, 4, {{1, 1}, {2, 2}, {3, 3}}};
    static inline const file_state new_state{0, 5, {{1, 10}, {3, 3}, {4, 40}}};

    static void make_old_state(registry_at & r)
    {
        file_image image;
        image.row(0, 1, 1);
        image.row(0, 2, 2);
        image.row(0, 3, 3);
        image.commit(4);
        write_file(r.path, image.content());
    }
    static void change(rg_opaque_handle_t table)
    {
        EXPECT_EQ(add(table, 4, 40), 0);
        EXPECT_EQ(set(table, 1, 10), 0);
        EXPECT_EQ(remove(table, 2), 0);
    }
    // One transaction, and the moments ahead of each of its calls.
    static std::vector<moment> moments_of_a_transaction(kt_uint32_t rewrite)
    {
        std::vector<moment> moments;
        for (const call which : disk_calls)
            for (unsigned nth = 1;; ++nth) {
                registry_at r;
                make_old_state(r);
                rg_opaque_handle_t table = r.open(explicitly);
                change(table);
                reset_calls();
                moment crash;
                before_call(which, nth, [&] { crash.take(r); });
                EXPECT_EQ(rg_i_apply(&object(table), rewrite, 0), 0);
                EXPECT_EQ(rg_commit_1(table), 0);
                reset_calls();
                if (!crash.reached)
                    break;
                moments.push_back(std::move(crash));
            }
        return moments;
    }
};

bool is_old_or_new(const file_state & state, const file_state & old_state, const file_state & new_state)
{
    return state == old_state || state == new_state;
}

} // namespace

TEST_F(after_a_crash, ahead_of_each_call_of_an_append_the_old_state_stands_until_the_overwrite)
{
    unsigned old_ones = 0, new_ones = 0;
    for (const moment & crash : moments_of_a_transaction(0)) {
        const file_state state = crash.state();
        EXPECT_TRUE(is_old_or_new(state, old_state, new_state)) << state;
        ++(state == old_state ? old_ones : new_ones);
    }
    EXPECT_GE(old_ones, 5u);
    EXPECT_EQ(new_ones, 1u) << "ahead of the last sync alone";
}

TEST_F(after_a_crash, ahead_of_each_call_of_a_rewrite_the_old_state_stands)
{
    unsigned count = 0;
    for (const moment & crash : moments_of_a_transaction(1)) {
        EXPECT_EQ(crash.state(), old_state);
        ++count;
    }
    EXPECT_GE(count, 5u);
}

TEST_F(after_a_crash, any_part_of_what_an_append_wrote_leaves_the_old_state)
{
    registry_at r;
    make_old_state(r);
    const bytes        before = read_file(r.path);
    rg_opaque_handle_t table  = r.open(explicitly);
    change(table);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    const bytes whole = read_file(r.path);
    for (size_t length = before.size(); length <= whole.size(); ++length) {
        // Cut here, or full length with the rest as zeros or as garbage: blocks may arrive in any order.
        bytes content(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_EQ(state_of_bytes(content), old_state) << length;
        content.resize(whole.size(), 0);
        EXPECT_EQ(state_of_bytes(content), old_state) << length;
        std::fill(content.begin() + static_cast<std::ptrdiff_t>(length), content.end(), 0xA5);
        EXPECT_EQ(state_of_bytes(content), old_state) << length;
        // The other way round: the end arrived and the start didn't.
        bytes reversed = whole;
        std::fill(reversed.begin() + static_cast<std::ptrdiff_t>(before.size()),
                  reversed.begin() + static_cast<std::ptrdiff_t>(length), 0);
        EXPECT_EQ(state_of_bytes(reversed), old_state) << length;
    }
}

TEST_F(after_a_crash, any_part_of_a_rewrite_file_is_not_looked_at)
{
    registry_at r;
    make_old_state(r);
    rg_opaque_handle_t table = r.open(explicitly);
    change(table);
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    const bytes whole = read_file(r.rewrite);
    moment      crash;
    crash.table = read_file(r.path);
    for (size_t length = 0; length <= whole.size(); length += 7) {
        crash.rewrite = bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_EQ(crash.state(), old_state);
    }
}

TEST_F(after_a_crash, behind_the_rename_the_new_state_stands)
{
    registry_at r;
    make_old_state(r);
    rg_opaque_handle_t table = r.open(explicitly);
    change(table);
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(r.dir.path()), new_state);
}

TEST_F(after_a_crash, the_next_life_writes_over_what_was_left_and_leaves_a_harmless_tail)
{
    for (const kt_uint32_t rewrite : {0u, 1u})
        for (const moment & crash : moments_of_a_transaction(rewrite)) {
            const file_state found = crash.state();
            registry_at      r;
            write_file(r.path, crash.table.value());
            if (crash.rewrite)
                write_file(r.rewrite, *crash.rewrite);
            rg_opaque_handle_t table = r.open(explicitly);
            // Shorter than what crashed: records and a commit record that is live stay behind.
            EXPECT_EQ(set(table, 3, 33), 0);
            EXPECT_EQ(rg_i_apply(&object(table), rewrite, 0), 0);
            EXPECT_EQ(state_in(r.dir.path()), found);
            EXPECT_EQ(rg_commit_1(table), 0);
            file_state expected = found;
            expected.rows[3]    = 33;
            ++expected.change_counter;
            EXPECT_EQ(state_in(r.dir.path()), expected);
            EXPECT_EQ(rg_close_table_1(table), 0);
            // And a life after that one.
            table = r.open(explicitly);
            EXPECT_EQ(set(table, 3, 34), 0);
            EXPECT_EQ(rg_apply_1(table, 0), 0);
            EXPECT_EQ(rg_commit_1(table), 0);
            expected.rows[3] = 34;
            ++expected.change_counter;
            EXPECT_EQ(state_in(r.dir.path()), expected);
        }
}

TEST_F(after_a_crash, every_single_fault_of_a_transaction_leaves_the_old_state_or_the_new_one_and_a_table_that_goes_on)
{
    unsigned injected = 0;
    for (const kt_uint32_t rewrite : {0u, 1u})
        for (const call which : {call::open, call::lockf, call::lseek, call::writev, call::write, call::fsync,
                                 call::rename, call::allocation})
            for (const int the_errno : {EIO, ENOSPC, EDQUOT, EACCES, EROFS, EMFILE, ENOLCK, EDEADLK, EFBIG, ESTALE})
                for (unsigned nth = 1;; ++nth) {
                    if (which == call::allocation && the_errno != EIO)
                        break; // memory runs out in one way only
                    registry_at r;
                    make_old_state(r);
                    rg_opaque_handle_t table       = r.open(explicitly);
                    const size_t       descriptors = open_descriptors();
                    change(table);
                    reset_calls();
                    fail_call(which, nth, the_errno);
                    kt_int32_t rc        = rg_i_apply(&object(table), rewrite, 0);
                    bool       committed = false;
                    if (rc == 0) {
                        rc        = rg_commit_1(table);
                        committed = rc == 0 && object(table).ready_for_commit == 0;
                    }
                    const bool failed = failed_as_asked(which);
                    reset_calls();
                    if (!failed) {
                        EXPECT_EQ(rc, 0);
                        break;
                    }
                    ++injected;
                    if (rc != 0) {
                        EXPECT_EQ(error_code(), rc);
                    }
                    const file_state found = state_in(r.dir.path());
                    EXPECT_EQ(found, committed ? new_state : old_state)
                        << "rewrite " << rewrite << " call " << static_cast<int>(which) << " nth " << nth << " errno "
                        << the_errno;
                    EXPECT_LE(open_descriptors(), descriptors + 1);
                    // On with it: the same transaction, or what is left of it.
                    if (!committed && object(table).ready_for_commit == 2) {
                        EXPECT_EQ(rg_abort_1(table), 0);
                        EXPECT_EQ(open_descriptors(), descriptors);
                        change(table);
                    }
                    if (!committed) {
                        if (object(table).ready_for_commit == 0) {
                            EXPECT_EQ(rg_i_apply(&object(table), rewrite, 0), 0);
                        }
                        EXPECT_EQ(rg_commit_1(table), 0);
                    }
                    EXPECT_EQ(state_in(r.dir.path()), new_state);
                    EXPECT_EQ(open_descriptors(), descriptors);
                }
    EXPECT_GE(injected, 100u);
}
