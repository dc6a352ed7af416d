// SPDX-License-Identifier: MIT
// Several processes on one table file: who waits, who doesn't, and the traps of the system's file locks.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <thread>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicitly = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

// A byte from one process to another.
class signal_pipe
{
  public:
    signal_pipe() { EXPECT_EQ(pipe(ends_), 0); }
    ~signal_pipe()
    {
        close(ends_[0]);
        close(ends_[1]);
    }
    signal_pipe(const signal_pipe &)             = delete;
    signal_pipe & operator=(const signal_pipe &) = delete;
    void          give() const { EXPECT_EQ(write(ends_[1], "x", 1), 1); }
    // Whether a byte came in time.
    bool came(int milliseconds = 20000) const
    {
        pollfd p = {ends_[0], POLLIN, 0};
        if (poll(&p, 1, milliseconds) != 1)
            return false;
        char byte;
        return read(ends_[0], &byte, 1) == 1;
    }

  private:
    int ends_[2];
};

// Runs `work` in a process of its own; result() is what it returned. The child counts as a process that has opened no
// tree yet: it comes from a process without other threads and with no lock held.
class other_process
{
  public:
    template <class Work> explicit other_process(Work work) : child_(fork())
    {
        if (child_ != 0)
            return;
        In_Child_Process = 0;
        reset_calls();
        _exit(work() ? 0 : 1);
    }
    ~other_process()
    {
        if (child_ > 0) {
            kill(child_, SIGKILL);
            waitpid(child_, nullptr, 0);
        }
    }
    other_process(const other_process &)             = delete;
    other_process & operator=(const other_process &) = delete;
    bool            result()
    {
        int status = 0;
        waitpid(std::exchange(child_, -1), &status, 0);
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }
    pid_t id() const { return child_; }
    void  end_by_kill()
    {
        kill(child_, SIGKILL);
        waitpid(std::exchange(child_, -1), nullptr, 0);
    }

  private:
    pid_t child_;
};

// Comes back when the process waits for a file's lock. The system lists those who wait with an arrow.
void await_waiter(pid_t process)
{
    const std::string name = " " + std::to_string(process) + " ";
    for (int i = 0; i < 2000; ++i) {
        std::ifstream locks("/proc/locks");
        for (std::string line; std::getline(locks, line);)
            if (line.find("->") != std::string::npos && line.find(name) != std::string::npos)
                return;
        usleep(10000);
    }
    ADD_FAILURE() << "nobody waits";
}

struct processes : testing::Test {
    temp_dir          dir;
    working_directory here;
    std::string       path = dir.file("t");

    processes()
    {
        file_image image;
        image.row(0, 1, 1);
        image.commit(4);
        write_file(path, image.content());
    }
    static inline const file_state old_state{0, 4, {{1, 1}}};
    static inline const file_state new_state{0, 5, {{1, 1}, {2, 2}}};

    // Whether another process could lock some byte of the file now.
    bool another_could_lock(off_t at = 0) const
    {
        other_process tester([&] {
            const int fd = ::open(path.c_str(), O_RDWR);
            lseek(fd, at, SEEK_SET);
            return lockf(fd, F_TEST, 1) == 0;
        });
        return tester.result();
    }
};

struct at_registry {
    open_tree tree;
    explicit at_registry(const temp_dir & dir) { tree.mount("/r", dir.path()); }
    rg_opaque_handle_t open(kt_int32_t mode, kt_int32_t * p_rc = nullptr)
    {
        return open_table(tree, "/r/t", mode, p_rc);
    }
};

} // namespace

TEST_F(processes, a_second_writer_waits_until_the_first_closes_and_then_sees_its_commits)
{
    at_registry        r(dir);
    rg_opaque_handle_t table = r.open(explicitly);
    signal_pipe        opened;
    other_process      second([&] {
        at_registry        other(dir);
        rg_opaque_handle_t waited = other.open(RG_MODE_WRITE);
        opened.give();
        return rows_of(waited) == rows{{1, 1}, {2, 2}} && add(waited, 3, 3) == 0 && rg_close_table_1(waited) == 0;
    });
    EXPECT_EQ(add(table, 2, 2), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    await_waiter(second.id());
    EXPECT_FALSE(opened.came(0));
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_TRUE(opened.came());
    EXPECT_TRUE(second.result());
    EXPECT_EQ(state_in(dir.path()), (file_state{0, 6, {{1, 1}, {2, 2}, {3, 3}}}));
}

TEST_F(processes, a_writer_that_is_killed_gives_its_lock_up_and_leaves_its_last_commit)
{
    signal_pipe   applied;
    other_process first([&] {
        at_registry        other(dir);
        rg_opaque_handle_t table = other.open(explicitly);
        bool               good  = add(table, 2, 2) == 0 && rg_apply_1(table, 0) == 0;
        applied.give();
        for (;;)
            pause();
        return good;
    });
    ASSERT_TRUE(applied.came());
    EXPECT_EQ(state_in(dir.path()), old_state);
    first.end_by_kill();
    at_registry        r(dir);
    rg_opaque_handle_t table = r.open(explicitly);
    EXPECT_EQ(rows_of(table), (rows{{1, 1}}));
    EXPECT_EQ(add(table, 3, 3), 0);
    EXPECT_EQ(rg_apply_1(table, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_EQ(state_in(dir.path()), (file_state{0, 5, {{1, 1}, {3, 3}}}));
}

TEST_F(processes, a_reader_does_not_wait_and_sees_the_old_state_until_the_commit)
{
    signal_pipe   reached, go_on;
    other_process writer([&] {
        at_registry        other(dir);
        rg_opaque_handle_t table = other.open(explicitly);
        bool               good  = add(table, 2, 2) == 0;
        reached.give();
        good = go_on.came() && good && rg_apply_1(table, 0) == 0;
        reached.give();
        good = go_on.came() && good && rg_commit_1(table) == 0;
        reached.give();
        return go_on.came() && good;
    });
    ASSERT_TRUE(reached.came());
    EXPECT_EQ(state_in(dir.path()), old_state) << "pending";
    go_on.give();
    ASSERT_TRUE(reached.came());
    EXPECT_EQ(state_in(dir.path()), old_state) << "applied";
    at_registry        r(dir);
    rg_opaque_handle_t kept = r.open(RG_MODE_READ);
    go_on.give();
    ASSERT_TRUE(reached.came());
    EXPECT_EQ(state_in(dir.path()), new_state) << "committed, and still held by the writer";
    EXPECT_EQ(rows_of(kept), (rows{{1, 1}})) << "what was read stays what it was";
    go_on.give();
    EXPECT_TRUE(writer.result());
}

TEST_F(processes, the_lock_covers_the_whole_file_also_after_appends_and_rewrites)
{
    at_registry        r(dir);
    rg_opaque_handle_t table = r.open(explicitly);
    for (const kt_uint32_t rewrite : {0u, 1u, 0u}) {
        EXPECT_EQ(set(table, 1, rewrite), 0);
        EXPECT_EQ(rg_i_apply(&object(table), rewrite, 0), 0);
        EXPECT_EQ(rg_commit_1(table), 0);
        for (const off_t at : {off_t{0}, off_t{100}, off_t{1} << 31})
            EXPECT_FALSE(another_could_lock(at)) << rewrite << " " << at;
    }
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_TRUE(another_could_lock());
}

TEST_F(processes, an_open_for_reading_takes_no_lock)
{
    at_registry r(dir);
    EXPECT_NE(r.open(RG_MODE_READ), nullptr);
    EXPECT_TRUE(another_could_lock());
}

TEST_F(processes, a_reader_in_the_writing_process_that_closes_drops_the_writers_lock)
{
    // The system's locks belong to the process: closing any descriptor of the file gives them up. A second tree of the
    // process that reads the table and closes it is enough. Within one tree a reader shares the writer's object.
    at_registry        r(dir);
    rg_opaque_handle_t writer = r.open(explicitly);
    EXPECT_FALSE(another_could_lock());
    rg_opaque_handle_t sharer = r.open(RG_MODE_READ);
    EXPECT_EQ(sharer, writer);
    EXPECT_EQ(rg_close_table_1(sharer), 0);
    EXPECT_FALSE(another_could_lock());
    EXPECT_EQ(state_in(dir.path()), old_state); // opens, reads and closes, with a tree of its own
    EXPECT_TRUE(another_could_lock()) << "the writer works on without its lock";
}

TEST_F(processes, two_writers_of_one_process_in_two_trees_do_not_exclude_each_other)
{
    at_registry        first(dir), second(dir);
    rg_opaque_handle_t a = first.open(explicitly);
    rg_opaque_handle_t b = second.open(explicitly); // doesn't wait
    EXPECT_NE(a, b);
    EXPECT_NE(b, nullptr);
}

TEST_F(processes, a_writer_that_waited_while_a_rewrite_took_the_name_works_on_the_old_file)
{
    at_registry        r(dir);
    rg_opaque_handle_t table = r.open(explicitly);
    other_process      waiter([&] {
        at_registry        other(dir);
        rg_opaque_handle_t waited = other.open(RG_MODE_WRITE);
        // It has the lock of the unlinked file and reads its old contents; what it commits goes down with it.
        return rows_of(waited) == rows{{1, 1}} && add(waited, 9, 9) == 0 && rg_close_table_1(waited) == 0;
    });
    await_waiter(waiter.id());
    EXPECT_EQ(add(table, 2, 2), 0);
    EXPECT_EQ(rg_i_apply(&object(table), 1, 0), 0);
    EXPECT_EQ(rg_commit_1(table), 0);
    EXPECT_TRUE(waiter.result());
    EXPECT_EQ(state_in(dir.path()), new_state) << "the waiter's row is lost";
}

TEST_F(processes, a_reader_that_races_commits_never_misses_the_live_commit_record)
{
    signal_pipe   ready;
    other_process writer([&] {
        at_registry        other(dir);
        rg_opaque_handle_t table = other.open(RG_MODE_WRITE);
        ready.give();
        bool good = true;
        for (std::int64_t v = 0; v < 300 && good; ++v)
            good = set(table, 1, v) == 0;
        return good && rg_close_table_1(table) == 0;
    });
    ASSERT_TRUE(ready.came());
    std::uint64_t last = 0;
    for (int i = 0; i < 100; ++i) {
        const file_state state = state_in(dir.path());
        ASSERT_EQ(state.rc, 0);
        EXPECT_EQ(state.rows.size(), 1u);
        EXPECT_GE(state.change_counter, last);
        last = state.change_counter;
    }
    EXPECT_TRUE(writer.result());
    EXPECT_EQ(state_in(dir.path()), (file_state{0, 304, {{1, 299}}}));
}

TEST_F(processes, a_file_that_may_not_grow_gives_a_short_write_and_then_efbig_and_the_table_stays)
{
    other_process limited([&] {
        signal(SIGXFSZ, SIG_IGN);
        at_registry        other(dir);
        rg_opaque_handle_t table = other.open(explicitly);
        for (std::uint32_t id = 10; id < 20; ++id)
            if (add(table, id, id) != 0)
                return false;
        const rlimit limit = {300, 300};
        if (setrlimit(RLIMIT_FSIZE, &limit) != 0)
            return false;
        return rg_apply_1(table, 0) == RG_E_SYSTEM_CALL &&
               error_text().find("writev system call unexpectedly returned an errno of " + std::to_string(EFBIG)) !=
                   std::string::npos &&
               object(table).ready_for_commit == 0 && rg_abort_1(table) == 0 && rows_of(table) == rows{{1, 1}};
    });
    EXPECT_TRUE(limited.result());
    EXPECT_EQ(state_in(dir.path()), old_state);
}

// Two processes that each hold one table and, on another thread, wait for the other one's: no thread waits in a circle,
// and yet the system sees one, since it counts a process as one owner.
TEST_F(processes, that_each_hold_a_table_and_wait_for_the_others_on_another_thread_get_a_false_edeadlk)
{
    file_image image;
    image.commit(1);
    write_file(dir.file("u"), image.content());
    signal_pipe   child_holds;
    other_process child([&] {
        at_registry other(dir);
        if (open_table(other.tree, "/r/u", RG_MODE_WRITE) == nullptr)
            return false;
        child_holds.give();
        await_waiter(getppid());
        kt_int32_t  rc = 0;
        std::thread asker([&] {
            at_registry third(dir); // a tree of its own, as another part of the program would have
            if (open_table(third.tree, "/r/t", RG_MODE_WRITE, &rc) != nullptr)
                rc = 0;
        });
        asker.join();
        return rc == RG_E_SYSTEM_CALL;
    });
    ASSERT_TRUE(child_holds.came());
    at_registry        r(dir);
    rg_opaque_handle_t held = r.open(RG_MODE_WRITE);
    ASSERT_NE(held, nullptr);
    kt_int32_t  waiter_rc = -1;
    std::thread waiter([&] {
        at_registry other(dir);
        if (open_table(other.tree, "/r/u", RG_MODE_WRITE, &waiter_rc) != nullptr)
            waiter_rc = 0;
    });
    EXPECT_TRUE(child.result()) << "the false deadlock";
    waiter.join();
    EXPECT_EQ(waiter_rc, 0) << "the other one gets what it waited for";
}
