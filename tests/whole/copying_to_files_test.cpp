// SPDX-License-Identifier: MIT
// Copies and moves to files: what the file holds, how it comes into place, what locks are held meanwhile, and what
// every failing step leaves.
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "whole/places.h"

namespace kt_test
{

namespace
{

// The file that a rewrite of the table gives. A rewrite's commit record carries the next change counter, a copy's the
// committed one, so that the counter is put back.
bytes as_rewritten(rg_i_table_t & table, const std::string & path)
{
    EXPECT_EQ(rg_i_apply(&table, 1, 0), 0);
    bytes result = read_file(path + ".rewrite");
    result.resize(table.rewrite_file_length);
    for (unsigned i = 0; i < 8; ++i)
        result.at(table.disk_applied_commit_record_offset + 16 + i) =
            static_cast<std::uint8_t>(table.change_counter >> 8 * i);
    EXPECT_EQ(rg_i_abort(&table), 0);
    return result;
}

std::vector<rg_column_t> columns_of_all_kinds()
{
    static rg_field_def_t fields[2] = {{KT_INT32, text("first")}, {KT_CHAR_PTR, text("second")}};
    static kt_uint8_t     definition[sizeof(rg_sd_def_t) + sizeof(rg_field_def_t)];
    auto *                p_definition = reinterpret_cast<rg_sd_def_t *>(definition);
    p_definition->number_of_fields     = 2;
    std::memcpy(static_cast<void *>(p_definition->fields), fields, sizeof fields);
    rg_column_t structured = column("details", KT_SD_PTR, RG_STANDARD, null_value());
    structured.sd_defn     = p_definition;
    return {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("name", KT_CHAR_PTR, RG_STANDARD, string("nobody")),
            structured, column("val", KT_INT64)};
}

int lock_state(const std::string & path)
{
    // Asked by another process: to its own process a lock is free.
    const pid_t pid = fork();
    if (pid == 0) {
        const int fd = open(path.c_str(), O_RDWR);
        _exit(fd < 0 ? 2 : lockf(fd, F_TEST, 0) == 0 ? 0 : 1);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WEXITSTATUS(status);
}
constexpr int is_free = 0, is_locked = 1;

} // namespace

// ---- What the file holds ----

TEST(a_copy_to_a_file, of_0_to_50_rows_is_the_file_that_a_rewrite_of_the_table_gives)
{
    places             p;
    rg_opaque_handle_t table = create_table(p.tree, "/r/t", columns_of_all_kinds(), explicit_writing);
    for (std::uint32_t rows = 0; rows <= 50; ++rows) {
        ASSERT_EQ(copy_by_handle(table, "/r/copy", 1), 0);
        EXPECT_EQ(read_file(p.dir.file("copy")), as_rewritten(object(table), p.dir.file("t"))) << rows << " rows";
        ASSERT_EQ(add_row(table, {{"id", uint32(rows)}, {"name", string(std::string(rows, 'x'))}}), 0);
        ASSERT_EQ(commit(table), 0);
    }
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_to_a_file, of_100000_rows_is_the_file_that_a_rewrite_of_the_table_gives)
{
    places             p;
    rg_opaque_handle_t table = create_hashed_table(
        p.tree, "/r/t", {column("id", KT_UINT32, RG_PRIMARY_KEY_NOCHECK), column("val", KT_INT64)}, explicit_writing);
    for (std::uint32_t id = 0; id < 100000; ++id)
        ASSERT_EQ(add(table, id, id), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(copy_by_handle(table, "/r/copy"), 0);
    EXPECT_TRUE(read_file(p.dir.file("copy")) == as_rewritten(object(table), p.dir.file("t")));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_to_a_file, of_up_to_14_rows_is_written_in_one_call_and_of_15_in_two)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {}, RG_MODE_WRITE);
    for (std::uint32_t rows = 1; rows <= 17; ++rows) {
        ASSERT_EQ(add(table, rows, rows), 0);
        fault_scope faults;
        ASSERT_EQ(copy_by_handle(table, "/r/copy", 1), 0);
        EXPECT_EQ(calls_made(call::writev), rows < 15 ? 1u : 2u) << rows;
        EXPECT_LE(longest_writev(), 16);
        EXPECT_EQ(calls_made(call::fsync), 1u);
    }
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_to_a_file, leaves_holes_and_deleted_rows_out_and_has_one_version_of_each_row)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}, {2, 20}, {3, 30}}, explicit_writing);
    ASSERT_EQ(remove(table, 2), 0);
    ASSERT_EQ(set(table, 3, 33), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(copy_by_handle(table, "/r/copy"), 0);
    EXPECT_EQ(read_file(p.dir.file("copy")), as_rewritten(object(table), p.dir.file("t")));
    EXPECT_EQ(p.rows_at("/r/copy"), (rows{{1, 10}, {3, 33}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_to_a_file, takes_pending_updates_along_with_the_committed_counter)
{
    for (const bool applied : {false, true})
        for (const char * path : {"/r/t", "/t"}) {
            places             p;
            rg_opaque_handle_t table   = p.create(path, {{1, 10}, {2, 20}, {3, 30}}, explicit_writing);
            const kt_uint64_t  counter = object(table).change_counter;
            ASSERT_EQ(add(table, 4, 40), 0);
            ASSERT_EQ(set(table, 1, 11), 0);
            ASSERT_EQ(remove(table, 2), 0);
            if (applied) {
                ASSERT_EQ(rg_apply_1(table, 0), 0);
            }
            EXPECT_EQ(copy_by_handle(table, "/r/copy"), 0);
            EXPECT_EQ(p.rows_at("/r/copy"), (rows{{1, 11}, {3, 30}, {4, 40}}));
            rg_opaque_handle_t copy = open_table(p.tree, "/r/copy", RG_MODE_READ);
            EXPECT_EQ(object(copy).change_counter, counter);
            EXPECT_EQ(rg_close_table_1(copy), 0);
            EXPECT_EQ(rg_abort_1(table), 0);
            EXPECT_EQ(rows_by_id(table), (rows{{1, 10}, {2, 20}, {3, 30}}));
            EXPECT_EQ(rg_close_table_1(table), 0);
        }
}

TEST(a_copy_to_a_file, does_not_stamp_the_rows_of_its_source)
{
    places             p;
    rg_opaque_handle_t table  = p.create("/r/t", {{1, 10}, {2, 20}, {3, 30}}, RG_MODE_WRITE, true);
    const auto         stamps = [&] {
        std::vector<kt_uint32_t> result;
        for (kt_uint32_t slot = 0; slot < 3; ++slot) {
            const rg_i_index_entry_t & entry = object(table).p_rows_fixed_index[slot];
            result.push_back(+entry.file_offset); // packed fields are copied, not referred to
            result.push_back(+entry.applied_file_offset);
            result.push_back(+rg_i_record_head(entry.p_committed)->disk_table_offset);
        }
        return result;
    };
    ASSERT_EQ(remove(table, 1), 0);
    ASSERT_EQ(add(table, 5, 50), 0);
    const auto before = stamps();
    ASSERT_EQ(copy_by_handle(table, "/r/copy"), 0);
    EXPECT_EQ(stamps(), before);
    ASSERT_EQ(set(table, 5, 51), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{2, 20}, {3, 30}, {5, 51}}));
}

TEST(a_copy_to_a_file, carries_the_application_metadata)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}});
    kt_binary_t        binary{1, {0xAB}};
    ASSERT_EQ(rg_set_application_metadata_1(table, &binary), 0);
    ASSERT_EQ(copy_by_handle(table, "/r/copy"), 0);
    rg_opaque_handle_t copy     = open_table(p.tree, "/r/copy", RG_MODE_READ);
    kt_binary_t *      p_binary = nullptr;
    ASSERT_EQ(rg_get_application_metadata_1(copy, &p_binary), 0);
    EXPECT_EQ(p_binary->length, 1u);
    EXPECT_EQ(p_binary->data[0], 0xAB);
    std::free(p_binary);
    EXPECT_EQ(rg_close_table_1(copy), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_to_a_file, takes_a_stale_rewrite_file_over_without_truncating_it)
{
    places p;
    p.create_and_close("/t", {{1, 10}});
    write_file(p.dir.file("copy.rewrite"), bytes(5000, 0xEE));
    EXPECT_EQ(copy_by_name(p.tree, "/t", "/r/copy"), 0);
    EXPECT_EQ(read_file(p.dir.file("copy")).size(), 5000u);
    EXPECT_EQ(p.rows_at("/r/copy"), (rows{{1, 10}}));
}

TEST(a_copy_of_a_file, has_every_byte_dead_ones_included)
{
    places p;
    p.create_and_close("/r/t", {{1, 10}, {2, 20}});
    bytes content = read_file(p.dir.file("t"));
    content.insert(content.end(), 70000, 0xDD); // behind the live commit record
    write_file(p.dir.file("t"), content);
    EXPECT_EQ(copy_by_name(p.tree, "/r/t", "/r/copy"), 0);
    EXPECT_EQ(read_file(p.dir.file("copy")), content);
    EXPECT_EQ(read_file(p.dir.file("t")), content);
    EXPECT_EQ(p.rows_at("/r/copy"), (rows{{1, 10}, {2, 20}}));
}

TEST(a_copy_of_a_file, that_does_not_exist_leaves_an_empty_target_behind)
{
    places p;
    for (const bool moves : {false, true}) {
        EXPECT_EQ(moves ? move_by_name(p.tree, "/r/t", "/r/copy") : copy_by_name(p.tree, "/r/t", "/r/copy"),
                  RG_E_NO_SUCH_TABLE);
        EXPECT_EQ(error_code(), RG_E_NO_SUCH_TABLE);
        EXPECT_EQ(read_file(p.dir.file("copy")), bytes{});
        EXPECT_FALSE(file_exists(p.dir.file("copy.rewrite")));
    }
}

// ---- The target ----

TEST(a_target_file_of_no_length, needs_no_overwrite)
{
    places p;
    p.create_and_close("/t", {{1, 10}});
    p.create_and_close("/r/t", {{2, 20}});
    write_file(p.dir.file("a"), {});
    write_file(p.dir.file("b"), {});
    EXPECT_EQ(copy_by_name(p.tree, "/t", "/r/a"), 0);
    EXPECT_EQ(p.rows_at("/r/a"), (rows{{1, 10}}));
    EXPECT_EQ(move_by_name(p.tree, "/r/t", "/r/b"), 0);
    EXPECT_EQ(p.rows_at("/r/b"), (rows{{2, 20}}));
}

TEST(a_move_of_a_file, is_a_rename_that_replaces_the_target)
{
    places p;
    p.create_and_close("/r/t", {{1, 10}});
    p.create_and_close("/r/target", {{2, 20}});
    struct stat before, after;
    ASSERT_EQ(stat(p.dir.file("t").c_str(), &before), 0);
    fault_scope faults;
    EXPECT_EQ(move_by_name(p.tree, "/r/t", "/r/target", 1), 0);
    EXPECT_EQ(calls_made(call::rename), 1u);
    EXPECT_EQ(calls_made(call::write) + calls_made(call::writev) + calls_made(call::fsync), 0u);
    ASSERT_EQ(stat(p.dir.file("target").c_str(), &after), 0);
    EXPECT_EQ(before.st_ino, after.st_ino);
    EXPECT_FALSE(file_exists(p.dir.file("t")));
    EXPECT_EQ(p.rows_at("/r/target"), (rows{{1, 10}}));
}

TEST(a_move_of_a_file, to_another_file_system_fails_with_the_rename)
{
    places p;
    p.create_and_close("/r/t", {{1, 10}});
    {
        fault_scope faults;
        fail_call(call::rename, 1, EXDEV);
        EXPECT_EQ(move_by_name(p.tree, "/r/t", "/r/target"), RG_E_SYSTEM_CALL);
        EXPECT_NE(error_text().find("rename"), std::string::npos);
    }
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{1, 10}}));
}

TEST(a_target_that_is_open, shows_the_new_table_and_what_was_pending_is_dropped)
{
    places             p;
    rg_opaque_handle_t source = p.create("/t", {{1, 10}, {2, 20}, {3, 30}});
    rg_opaque_handle_t target = p.create("/r/target", {{7, 70}}, explicit_writing);
    ASSERT_EQ(add(target, 8, 80), 0);
    ASSERT_EQ(remove(target, 7), 0);
    ASSERT_EQ(rg_apply_1(target, 0), 0);
    EXPECT_EQ(copy_by_handle(source, "/r/target", 1), 0);
    EXPECT_EQ(rows_by_id(target), (rows{{1, 10}, {2, 20}, {3, 30}}));
    EXPECT_EQ(object(target).ready_for_commit, 0u);
    EXPECT_EQ(object(target).applied_deletions, 0u);
    EXPECT_EQ(object(target).p_rows_change_list, nullptr);
    EXPECT_EQ(object(target).p_delete_rows_change_list, nullptr);
    EXPECT_EQ(object(target).implicitly_controlled, 0u);
    EXPECT_EQ(lock_state(p.dir.file("target")), is_locked) << "a writer's lock is on the new file";
    EXPECT_EQ(rg_close_table_1(source), 0);
    EXPECT_EQ(rg_close_table_1(target), 0);
}

TEST(a_target_that_is_open_with_a_hash_table, forgets_that_the_work_failed)
{
    places             p;
    rg_opaque_handle_t source = p.create("/t", {{1, 10}});
    rg_opaque_handle_t target = p.create("/r/target", {{7, 70}}, RG_MODE_WRITE, true);
    EXPECT_EQ(copy_by_handle(source, "/r/target", 0), 0) << "the target exists";
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(rows_by_id(target), (rows{{7, 70}}));
    {
        fault_scope faults;
        fail_call(call::rename, 1, EACCES);
        EXPECT_EQ(copy_by_handle(source, "/r/target", 1), 0);
    }
    EXPECT_EQ(rows_by_id(target), (rows{{7, 70}}));
    kt_value_t val;
    EXPECT_EQ(rg_get_field_by_key_1(target, uint32(7), text("val"), &val), 0);
    EXPECT_EQ(lock_state(p.dir.file("target")), is_locked) << "the lock is taken again on the same file";
    EXPECT_EQ(rg_close_table_1(source), 0);
    EXPECT_EQ(rg_close_table_1(target), 0);
}

TEST(a_target_that_is_open_for_reading, can_not_be_locked)
{
    places p;
    p.create_and_close("/t", {{1, 10}});
    p.create_and_close("/r/target", {{7, 70}});
    rg_opaque_handle_t target = open_table(p.tree, "/r/target", RG_MODE_READ);
    const size_t       before = open_descriptors();
    EXPECT_EQ(copy_by_name(p.tree, "/t", "/r/target", 1), RG_E_SYSTEM_CALL);
    EXPECT_NE(error_text().find("lockf"), std::string::npos);
    EXPECT_EQ(open_descriptors(), before);
    EXPECT_EQ(rows_by_id(target), (rows{{7, 70}}));
    EXPECT_EQ(rg_close_table_1(target), 0);
}

// ---- Onto itself ----

TEST(a_table_with_a_file, may_be_copied_onto_itself_with_overwrite)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}, {2, 20}});
    ASSERT_EQ(remove(table, 1), 0);
    EXPECT_EQ(copy_by_handle(table, "/r/t", 0), RG_E_TABLE_EXISTS);
    EXPECT_EQ(copy_by_handle(table, "/r/t", 1), 0);
    EXPECT_EQ(object(table).total_applied_rows, 1u);
    EXPECT_EQ(lock_state(p.dir.file("t")), is_locked);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{2, 20}}));
    EXPECT_EQ(copy_by_name(p.tree, "/r/t", "/r/t", 1), 0) << "nor does the file alone mind";
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{2, 20}}));
}

TEST(a_table, can_not_be_moved_onto_itself_nor_copied_there_in_memory)
{
    places             p;
    rg_opaque_handle_t transient = p.create("/t", {{1, 10}});
    rg_opaque_handle_t kept      = p.create("/r/t", {{2, 20}});
    p.create_and_close("/r/file", {{3, 30}});
    for (const kt_int32_t overwrite : {0, 1}) {
        EXPECT_EQ(copy_by_handle(transient, "/t", overwrite), RG_E_TABLE_EXISTS);
        EXPECT_EQ(copy_by_name(p.tree, "/t", "/t", overwrite), RG_E_TABLE_EXISTS);
        EXPECT_EQ(move_by_handle(transient, "/t", overwrite), RG_E_TABLE_EXISTS);
        EXPECT_EQ(move_by_handle(kept, "/r/t", overwrite), RG_E_TABLE_EXISTS);
        EXPECT_EQ(move_by_name(p.tree, "/r/file", "/r/file", overwrite), RG_E_TABLE_EXISTS);
        EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
        EXPECT_EQ(move_by_name(p.tree, "/r/nothing", "/r/nothing", overwrite), RG_E_NO_SUCH_TABLE);
        EXPECT_EQ(copy_by_name(p.tree, "/r/nothing", "/r/nothing", overwrite), RG_E_NO_SUCH_TABLE);
    }
    EXPECT_FALSE(file_exists(p.dir.file("nothing")));
    EXPECT_EQ(p.rows_at("/t"), (rows{{1, 10}}));
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{2, 20}}));
    EXPECT_EQ(p.rows_at("/r/file"), (rows{{3, 30}}));
    EXPECT_EQ(rg_close_table_1(transient), 0);
    EXPECT_EQ(rg_close_table_1(kept), 0);
}

// ---- Moves of objects ----

TEST(a_move_to_a_file, leaves_the_object_of_a_handle_working_outside_the_tree)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}});
    EXPECT_EQ(move_by_handle(table, "/r/moved"), 0);
    EXPECT_EQ(p.code_at("/t"), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(add(table, 2, 20), 0);
    EXPECT_EQ(rows_by_id(table), (rows{{1, 10}, {2, 20}}));
    EXPECT_EQ(p.rows_at("/r/moved"), (rows{{1, 10}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_move_to_a_file, whose_source_can_not_be_removed_is_a_success)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}});
    {
        fault_scope faults;
        fail_call(call::unlink, 1, EACCES);
        EXPECT_EQ(move_by_handle(table, "/r/moved"), 0);
        EXPECT_EQ(error_code(), 0);
    }
    EXPECT_EQ(p.rows_at("/r/moved"), (rows{{1, 10}}));
    EXPECT_EQ(open_table(p.tree, "/r/t", RG_MODE_WRITE), table) << "and stays where it was";
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

// ---- Locks ----

TEST(a_copy_to_a_file, holds_the_directory_and_the_target_until_it_is_done)
{
    places p;
    p.create_and_close("/t", {{1, 10}});
    fault_scope faults;
    int         directory = -1;
    int         target    = -1;
    before_call(call::rename, 1, [&] {
        directory = lock_state(p.dir.file(",Lock"));
        target    = lock_state(p.dir.file("copy"));
    });
    EXPECT_EQ(copy_by_name(p.tree, "/t", "/r/copy"), 0);
    EXPECT_EQ(directory, is_locked);
    EXPECT_EQ(target, is_locked);
    EXPECT_EQ(lock_state(p.dir.file(",Lock")), is_free);
    EXPECT_EQ(lock_state(p.dir.file("copy")), is_free);
    EXPECT_EQ(read_file(p.dir.file(",Lock")), bytes{});
}

TEST(a_copy_to_a_file, waits_for_another_process_that_has_the_directory_or_the_target)
{
    for (const char * held : {",Lock", "copy"}) {
        places p;
        p.create_and_close("/t", {{1, 10}});
        int ready[2];
        ASSERT_EQ(pipe(ready), 0);
        const pid_t pid = fork();
        if (pid == 0) {
            const int fd = open(p.dir.file(held).c_str(), O_RDWR | O_CREAT, 0644);
            if (fd < 0 || lockf(fd, F_LOCK, 0) != 0 || write(ready[1], "x", 1) != 1)
                _exit(1);
            usleep(150000);
            const int marker = open(p.dir.file("marker").c_str(), O_RDWR | O_CREAT, 0644);
            _exit(marker < 0 ? 1 : 0); // which gives up the lock
        }
        char c = 0;
        ASSERT_EQ(read(ready[0], &c, 1), 1);
        EXPECT_EQ(copy_by_name(p.tree, "/t", "/r/copy"), 0);
        EXPECT_TRUE(file_exists(p.dir.file("marker"))) << "the other process was done";
        int status = -1;
        waitpid(pid, &status, 0);
        EXPECT_EQ(status, 0);
        close(ready[0]);
        close(ready[1]);
        EXPECT_EQ(p.rows_at("/r/copy"), (rows{{1, 10}}));
    }
}

TEST(a_copy_to_a_file, of_another_tree_gives_up_the_lock_that_this_process_has_on_the_target)
{
    places             p;
    rg_opaque_handle_t target = p.create("/r/target", {{7, 70}});
    open_tree          other;
    other.mount("/r", p.dir.path());
    ASSERT_EQ(rg_close_table_1(create_table(other, "/t", example_columns(), RG_MODE_WRITE)), 0);
    EXPECT_EQ(lock_state(p.dir.file("target")), is_locked);
    EXPECT_EQ(copy_by_name(other, "/t", "/r/target", 0), RG_E_TABLE_EXISTS);
    EXPECT_EQ(lock_state(p.dir.file("target")), is_free) << "closing any descriptor of a file does that";
    EXPECT_EQ(rg_close_table_1(target), 0);
}

// ---- Bad input ----

TEST(copies_and_moves, refuse_what_is_no_path_or_no_table)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}});
    EXPECT_EQ(rg_copy_table_by_handle_1(table, nullptr, 0), RG_E_INVALID_PATH);
    EXPECT_EQ(rg_move_table_by_handle_1(table, text("a,b"), 0), RG_E_INVALID_PATH);
    EXPECT_EQ(rg_copy_table_by_name_1(p.tree, nullptr, text("/x"), 0), RG_E_INVALID_PATH);
    EXPECT_EQ(rg_move_table_by_name_1(p.tree, text("/t"), nullptr, 0), RG_E_INVALID_PATH);
    EXPECT_EQ(copy_by_name(p.tree, "/nothing", "/r/x"), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(move_by_name(p.tree, "/nothing", "/x"), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(copy_by_name(p.tree, "/r/nothing", "/x"), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(copy_by_name(nullptr, "/t", "/x"), RG_E_INVALID_HANDLE);
    EXPECT_EQ(move_by_handle(nullptr, "/x"), RG_E_INVALID_HANDLE);
    EXPECT_EQ(error_code(), RG_E_INVALID_HANDLE);
    EXPECT_FALSE(file_exists(p.dir.file(",Lock")));
    EXPECT_EQ(p.rows_at("/t"), (rows{{1, 10}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

// ---- Bad luck ----

namespace
{

// One kind of copy or move to a file, over a target that exists.
struct road_to_a_file {
    const char * source; // its path
    bool         open;
    bool         moves;
};

class each_road_to_a_file : public ::testing::TestWithParam<road_to_a_file>
{
};

// Each step is made to fail in turn, until the call succeeds. After a failure target, source, descriptors and the
// rewrite file must be as before.
void fail_each(call which, int the_errno, std::initializer_list<kt_int32_t> codes)
{
    const road_to_a_file & road = each_road_to_a_file::GetParam();
    for (unsigned nth = 1; nth < 100; ++nth) {
        working_directory  scratch; // a failed sync leaves a witness
        places             p;
        rg_opaque_handle_t source = p.create(road.source, {{1, 10}, {2, 20}});
        if (!road.open) {
            ASSERT_EQ(rg_close_table_1(std::exchange(source, nullptr)), 0);
        }
        p.create_and_close("/r/target", {{7, 70}});
        const bytes  target_before = read_file(p.dir.file("target"));
        const size_t descriptors   = open_descriptors();
        kt_int32_t   rc            = 0;
        bool         failed        = false;
        {
            fault_scope faults;
            fail_call(which, nth, the_errno);
            rc     = road.moves ? move_by_name(p.tree, road.source, "/r/target", 1)
                                : copy_by_name(p.tree, road.source, "/r/target", 1);
            failed = failed_as_asked(which);
        }
        EXPECT_EQ(open_descriptors(), descriptors);
        if (rc == 0) {
            EXPECT_EQ(p.rows_at("/r/target"), (rows{{1, 10}, {2, 20}}));
        } else {
            EXPECT_NE(std::find(codes.begin(), codes.end(), rc), codes.end()) << rc << " at " << nth;
            EXPECT_EQ(error_code(), rc);
            EXPECT_EQ(read_file(p.dir.file("target")), target_before);
            EXPECT_FALSE(file_exists(p.dir.file("target.rewrite")));
            EXPECT_EQ(p.rows_at(road.source), (rows{{1, 10}, {2, 20}}));
        }
        EXPECT_EQ(lock_state(p.dir.file("target")), is_free);
        if (source != nullptr) {
            EXPECT_EQ(rg_close_table_1(source), 0);
        }
        if (!failed)
            return;
    }
    FAIL() << "the call never succeeds";
}

} // namespace

TEST_P(each_road_to_a_file, without_memory_changes_nothing)
{
    fail_each(call::allocation, ENOMEM, {RG_E_NO_MEMORY});
}
TEST_P(each_road_to_a_file, with_a_failing_open_changes_nothing)
{
    fail_each(call::open, ENOSPC, {RG_E_FILESYSTEM_FULL_DETAIL, RG_E_SYSTEM_CALL});
    fail_each(call::open, EACCES, {RG_E_ACCESS, RG_E_SYSTEM_CALL});
    fail_each(call::open, EMFILE, {RG_E_SYSTEM_CALL});
}
TEST_P(each_road_to_a_file, with_a_failing_lock_changes_nothing)
{
    fail_each(call::lockf, EDEADLK, {RG_E_SYSTEM_CALL});
}
TEST_P(each_road_to_a_file, with_a_failing_seek_changes_nothing)
{
    fail_each(call::lseek, EIO, {RG_E_SYSTEM_CALL});
}
TEST_P(each_road_to_a_file, with_a_failing_read_changes_nothing)
{
    fail_each(call::read, EIO, {RG_E_SYSTEM_CALL});
}
TEST_P(each_road_to_a_file, with_a_failing_write_changes_nothing)
{
    for (const call which : {call::write, call::writev, call::fsync}) {
        fail_each(which, ENOSPC, {RG_E_FILESYSTEM_FULL_DETAIL});
        fail_each(which, EIO, {RG_E_SYSTEM_CALL});
    }
}
TEST_P(each_road_to_a_file, with_a_failing_rename_changes_nothing)
{
    fail_each(call::rename, ENOSPC, {RG_E_FILESYSTEM_FULL_DETAIL});
    fail_each(call::rename, EACCES, {RG_E_ACCESS});
    fail_each(call::rename, ENOENT, {RG_E_NO_SUCH_TABLE});
    fail_each(call::rename, EXDEV, {RG_E_SYSTEM_CALL});
}

INSTANTIATE_TEST_SUITE_P(roads, each_road_to_a_file,
                         ::testing::Values(road_to_a_file{"/t", true, false}, road_to_a_file{"/t", false, true},
                                           road_to_a_file{"/r/t", true, true}, road_to_a_file{"/r/t", false, false},
                                           road_to_a_file{"/r/t", false, true}),
                         [](const ::testing::TestParamInfo<road_to_a_file> & info) {
                             return std::string(info.param.moves ? "moving_" : "copying_") +
                                    (info.param.source[1] == 'r' ? info.param.open ? "an_open_file" : "a_file"
                                                                 : "a_table_in_memory");
                         });

TEST(a_refresh_that_fails, leaves_the_handles_of_the_target_what_they_had)
{
    for (const bool hashed : {false, true})
        for (unsigned nth = 1; nth < 100; ++nth) {
            places             p;
            rg_opaque_handle_t source = p.create("/t", {{1, 10}});
            rg_opaque_handle_t target = p.create("/r/target", {{7, 70}}, RG_MODE_WRITE, hashed);
            const size_t       before = open_descriptors();
            kt_int32_t         rc     = 0;
            bool               failed = false;
            {
                fault_scope faults;
                fail_call(call::allocation, nth, ENOMEM);
                rc     = copy_by_handle(source, "/r/target", 1);
                failed = failed_as_asked(call::allocation);
            }
            EXPECT_TRUE(rc == 0 || (rc == RG_E_NO_MEMORY && error_code() == RG_E_NO_MEMORY)) << rc;
            EXPECT_EQ(open_descriptors(), before);
            const rows shown = rows_by_id(target);
            EXPECT_TRUE(shown == (rows{{1, 10}}) || (shown == (rows{{7, 70}}) && (failed || hashed)));
            EXPECT_EQ(rg_close_table_1(source), 0);
            EXPECT_EQ(rg_close_table_1(target), 0);
            if (!failed)
                break;
        }
}

TEST(a_copy_without_memory_for_its_rows, takes_the_rewrite_file_of_an_applied_source_away)
{
    places             p;
    rg_opaque_handle_t source = p.create("/r/t", {{1, 10}}, explicit_writing);
    ASSERT_EQ(add(source, 2, 20), 0);
    ASSERT_EQ(rg_i_apply(&object(source), 1, 0), 0);
    const size_t before = open_descriptors();
    bool         taken  = false;
    for (unsigned nth = 1; nth < 20 && !taken; ++nth) {
        fault_scope faults;
        fail_call(call::allocation, nth, ENOMEM);
        if (copy_by_handle(source, "/r/copy", 1) == 0)
            break;
        EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
        EXPECT_FALSE(file_exists(p.dir.file("copy.rewrite")));
        taken = !file_exists(p.dir.file("t.rewrite"));
    }
    EXPECT_TRUE(taken);
    EXPECT_EQ(object(source).rewrite_file_fd, -1);
    EXPECT_EQ(open_descriptors(), before - 1);
    EXPECT_EQ(rg_commit_1(source), RG_E_SYSTEM_CALL);
    EXPECT_EQ(rg_abort_1(source), 0);
    EXPECT_EQ(rows_by_id(source), (rows{{1, 10}}));
    EXPECT_EQ(rg_close_table_1(source), 0);
}

} // namespace kt_test
