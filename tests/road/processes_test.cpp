// SPDX-License-Identifier: MIT
// Several processes at one table: a second writer waits, a reader doesn't and sees the last commit, a writer that dies
// leaves the table at it, and a forked child can't update.
//
// A second process is this program run again with its part in the environment, so that it starts with nothing of ours.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <functional>

#include "support/rows.h"

extern char ** environ;

namespace kt_test
{

namespace
{

constexpr kt_int32_t writing  = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;
constexpr kt_int32_t implicit = RG_MODE_READ | RG_MODE_WRITE;

// ---- The second process's side ----

void say(const std::string & line)
{
    const std::string with_end = line + "\n";
    if (write(STDOUT_FILENO, with_end.data(), with_end.size()) < 0)
        _exit(9);
}

void wait_to_be_killed_or_told()
{
    char c = 0;
    if (read(STDIN_FILENO, &c, 1) < 0)
        _exit(9);
}

std::string rows_seen(rg_opaque_handle_t table)
{
    std::string result;
    for (kt_uint32_t packed = 0; packed < object_of(table).total_applied_rows; ++packed)
        result += std::to_string(read_packed(table, packed, "id").value.val_uint32) + " ";
    return result;
}

int play(const std::string & part, const std::string & directory)
{
    rg_opaque_handle_t tree  = nullptr;
    rg_opaque_handle_t table = nullptr;
    if (rg_open_tree_1(&tree, 0, 0) != 0 || rg_mount_local_tree_1(tree, text("/m"), text(directory), 1) != 0)
        return 2;
    say("ready");
    const kt_int32_t mode = part == "read" ? RG_MODE_READ : part == "add" ? implicit : writing;
    if (const kt_int32_t rc = rg_open_table_1(tree, text("/m/t"), mode, &table); rc != 0)
        return 3;
    say("open " + rows_seen(table));
    if (part == "add") {
        wait_to_be_killed_or_told();
        say("added " + std::to_string(add_row(table, {{"id", uint32(50)}})));
    } else if (part == "apply") {
        if (add_row(table, {{"id", uint32(60)}}) != 0 || rg_apply_1(table, 0) != 0)
            return 4;
        say("applied");
        wait_to_be_killed_or_told();
    }
    wait_to_be_killed_or_told();
    if (rg_close_table_1(table) != 0 || rg_close_tree_1(tree) != 0)
        return 5;
    say("closed");
    return 0;
}

// Runs ahead of main in every process; only one that was given a part plays it.
const bool Played = [] {
    const char * p_part = std::getenv("ROAD_TEST_PART");
    if (p_part != nullptr)
        _exit(play(p_part, std::getenv("ROAD_TEST_DIRECTORY")));
    return false;
}();

// ---- The test's side ----

class second_process
{
  public:
    second_process(const char * p_part, const std::string & directory)
    {
        int to[2];
        int from[2];
        EXPECT_EQ(pipe2(to, O_CLOEXEC), 0);
        EXPECT_EQ(pipe2(from, O_CLOEXEC), 0);
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_adddup2(&actions, to[0], STDIN_FILENO);
        posix_spawn_file_actions_adddup2(&actions, from[1], STDOUT_FILENO);
        std::vector<std::string> variables{std::string("ROAD_TEST_PART=") + p_part, "ROAD_TEST_DIRECTORY=" + directory};
        std::vector<char *>      environment;
        for (char ** p = environ; *p != nullptr; ++p)
            environment.push_back(*p);
        for (std::string & variable : variables)
            environment.push_back(variable.data());
        environment.push_back(nullptr);
        char   name[]{"second"};
        char * arguments[]{name, nullptr};
        EXPECT_EQ(posix_spawn(&pid_, "/proc/self/exe", &actions, nullptr, arguments, environment.data()), 0);
        posix_spawn_file_actions_destroy(&actions);
        close(to[0]);
        close(from[1]);
        to_   = to[1];
        from_ = from[0];
    }

    ~second_process()
    {
        close(to_);
        close(from_);
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }

    second_process(const second_process &)             = delete;
    second_process & operator=(const second_process &) = delete;

    // Its next line, or "" if none comes in that time.
    std::string line(int timeout_ms = 20'000)
    {
        std::string result;
        for (;;) {
            pollfd wanted{from_, POLLIN, 0};
            if (poll(&wanted, 1, timeout_ms) <= 0)
                return "";
            char c = 0;
            if (read(from_, &c, 1) != 1)
                return "(ended)";
            if (c == '\n')
                return result;
            result += c;
        }
    }

    void go_on() { EXPECT_EQ(write(to_, "x", 1), 1); }

    int wait_for_its_end()
    {
        int status = -1;
        EXPECT_EQ(waitpid(std::exchange(pid_, -1), &status, 0) > 0, true);
        return status;
    }

    void be_killed()
    {
        kill(pid_, SIGKILL);
        EXPECT_TRUE(WIFSIGNALED(wait_for_its_end()));
    }

  private:
    pid_t pid_  = -1;
    int   to_   = -1;
    int   from_ = -1;
};

struct two_processes : ::testing::Test {
    two_processes() { tree.mount("/m", directory.path()); }

    // The table with committed rows 1 and 2, open for writing here.
    rg_opaque_handle_t make_table(kt_int32_t mode = writing)
    {
        const rg_opaque_handle_t table =
            create_table(tree, "/m/t", {column("id", KT_UINT32, RG_PRIMARY_KEY), column("s", KT_CHAR_PTR)}, writing);
        EXPECT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
        EXPECT_EQ(add_row(table, {{"id", uint32(2)}}), 0);
        EXPECT_EQ(commit(table), 0);
        if (mode == writing)
            return table;
        EXPECT_EQ(rg_close_table_1(table), 0);
        return open_table(tree, "/m/t", mode);
    }

    temp_dir  directory;
    open_tree tree;
};

TEST_F(two_processes, take_turns_at_writing)
{
    const rg_opaque_handle_t table = make_table();
    second_process           other("add", directory.path());
    EXPECT_EQ(other.line(), "ready");
    EXPECT_EQ(other.line(200), "") << "it waits as long as the table is open for writing here";
    ASSERT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    ASSERT_EQ(commit(table), 0);
    EXPECT_EQ(other.line(50), "");
    ASSERT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(other.line(), "open 1 2 3 ") << "and sees what was committed while it waited";
    other.go_on();
    EXPECT_EQ(other.line(), "added 0");
    other.go_on();
    EXPECT_EQ(other.line(), "closed");
    EXPECT_EQ(other.wait_for_its_end(), 0);
    const rg_opaque_handle_t again = open_table(tree, "/m/t", implicit);
    EXPECT_EQ(rows_seen(again), "1 2 3 50 ");
}

TEST_F(two_processes, do_not_wait_for_each_other_where_one_only_reads)
{
    make_table();
    second_process reader("read", directory.path());
    EXPECT_EQ(reader.line(), "ready");
    EXPECT_EQ(reader.line(), "open 1 2 ");
}

TEST_F(two_processes, see_the_old_state_until_the_commit)
{
    const rg_opaque_handle_t table = make_table();
    ASSERT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    {
        second_process reader("read", directory.path());
        EXPECT_EQ(reader.line(), "ready");
        EXPECT_EQ(reader.line(), "open 1 2 ") << "pending";
    }
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    second_process early("read", directory.path());
    EXPECT_EQ(early.line(), "ready");
    EXPECT_EQ(early.line(), "open 1 2 ") << "applied";
    ASSERT_EQ(rg_commit_1(table), 0);
    second_process late("read", directory.path());
    EXPECT_EQ(late.line(), "ready");
    EXPECT_EQ(late.line(), "open 2 3 ") << "committed";
    early.go_on();
    EXPECT_EQ(early.line(), "closed") << "who has it open keeps what it read";
}

TEST_F(two_processes, keep_the_last_commit_when_one_is_killed_between_apply_and_commit)
{
    ASSERT_EQ(rg_close_table_1(make_table()), 0);
    {
        second_process other("apply", directory.path());
        EXPECT_EQ(other.line(), "ready");
        EXPECT_EQ(other.line(), "open 1 2 ");
        EXPECT_EQ(other.line(), "applied");
        other.be_killed();
    }
    const rg_opaque_handle_t table = open_table(tree, "/m/t", implicit);
    ASSERT_NE(table, nullptr) << "its lock died with it";
    EXPECT_EQ(rows_seen(table), "1 2 ");
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}}), 0) << "over what it left behind";
    ASSERT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rows_seen(open_table(tree, "/m/t", RG_MODE_READ)), "1 2 4 ");
}

// ---- Forked children ----

TEST_F(two_processes, of_which_one_is_a_forked_child_update_in_the_parent_only)
{
    const rg_opaque_handle_t table = make_table();
    ASSERT_EQ(find_key(table, uint32(77)), -RG_E_NO_SUCH_KEY);
    const table_picture before = picture_of(table);
    const pid_t         child  = fork();
    if (child == 0) {
        kt_char_ptr_t names[]{text("s")};
        kt_value_t    value = string("x");
        kt_value_t *  values[]{&value};
        char          room[16]{};
        const auto    refused = {
               add_row(table, {{"id", uint32(3)}}),
               rg_set_field_by_index_1(table, 0, names[0], values[0]),
               rg_set_field_by_fixed_index_1(table, 0, names[0], values[0]),
               rg_set_field_by_key_1(table, uint32(1), names[0], values[0]),
               rg_set_fields_by_index_1(table, 0, names, values, 1),
               rg_set_fields_by_fixed_index_1(table, 0, names, values, 1),
               rg_set_fields_by_key_1(table, uint32(1), names, values, 1),
               rg_delete_row_by_index_1(table, 0),
               rg_set_application_metadata_1(table, reinterpret_cast<kt_binary_t *>(room)),
               rg_apply_1(table, 0),
               rg_commit_1(table),
               rg_abort_1(table),
               rg_add_row_1(nullptr, nullptr, nullptr, 0),
        };
        for (const kt_int32_t rc : refused)
            if (rc != RG_E_INTERNAL)
                _exit(1);
        if (error_code() != RG_E_NO_SUCH_KEY)
            _exit(2); // the parent's record: these set none
        if (read_key(table, uint32(2), "id").value.val_uint32 != 2)
            _exit(3); // what was inherited can be read
        if (rg_close_tree_1(tree) != 0)
            _exit(4);
        _exit(0);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(picture_of(table), before);
    EXPECT_EQ(add_row(table, {{"id", uint32(3)}}), 0);
    EXPECT_EQ(commit(table), 0);
}

} // namespace

} // namespace kt_test
