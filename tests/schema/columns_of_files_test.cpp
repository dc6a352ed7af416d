// SPDX-License-Identifier: MIT
// Column changes of tables with files: what the file holds, what of the object stays behind, and what a failure of each
// call or allocation leaves.
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "schema/columns_kit.h"
#include "storage/table_files.h"

namespace kt_test
{

namespace
{

struct column_changes_of_files : testing::Test, registry_of_tables {
    working_directory here; // a failed sync leaves a file
    fault_scope       faults;

    rg_opaque_handle_t filled(const std::string & name = "table", kt_int32_t mode = explicit_writing)
    {
        const rg_opaque_handle_t table = make({true, true}, three_columns(), mode, name);
        add_rows(table, three_rows());
        if ((mode & RG_MODE_EXPLICIT_CONTROL) != 0) {
            EXPECT_EQ(commit(table), 0);
        }
        return table;
    }
    std::string file(const std::string & name = "table") const { return directory.file(name); }
    std::string rewrite_file() const { return directory.file("table.rewrite"); }

    rg_opaque_handle_t reopened(rg_opaque_handle_t table, kt_int32_t mode = RG_MODE_READ)
    {
        EXPECT_EQ(rg_close_table_1(table), 0);
        return open_table(tree, "/kept/table", mode);
    }

    // A table of its own for each change, which is closed behind the action.
    void with_each_change(const std::function<void(rg_opaque_handle_t, const column_change &)> & action)
    {
        for (const column_change & change : all_changes()) {
            SCOPED_TRACE(change.name);
            const rg_opaque_handle_t table = filled();
            action(table, change);
            reset_calls();
            EXPECT_EQ(rg_close_table_1(table), 0);
            EXPECT_EQ(rg_delete_table_1(tree, text("/kept/table")), 0);
        }
    }
};

// Whether another process could lock the file.
bool another_process_can_lock(const std::string & path)
{
    const pid_t child = fork();
    if (child == 0) {
        const int fd = ::open(path.c_str(), O_RDWR);
        _exit(fd >= 0 && lockf(fd, F_TLOCK, 0) == 0 ? 1 : 0);
    }
    int status = 0;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    return WEXITSTATUS(status) == 1;
}

rg_opaque_handle_t opened_in(rg_opaque_handle_t tree, const bytes & content, const temp_dir & dir)
{
    write_file(dir.file("t"), content);
    EXPECT_EQ(rg_mount_local_tree_1(tree, text("/look"), text(dir.path()), 1), 0);
    return open_table(tree, "/look/t", RG_MODE_READ);
}

} // namespace

// ---- The file ----

TEST_F(column_changes_of_files, are_committed_in_the_file_when_they_return)
{
    for (const char * name : {"add", "delete", "rename", "default"}) {
        SCOPED_TRACE(name);
        rg_opaque_handle_t table = filled();
        for (const column_change & change : all_changes())
            if (change.name == std::string(name)) {
                ASSERT_EQ(change.make(table), 0);
            }
        EXPECT_FALSE(file_exists(rewrite_file()));
        const std::vector<std::string> columns = column_names_of(table);
        const kt_uint64_t              counter = object_of(table).change_counter;
        EXPECT_EQ(object_of(table).total_committed_rows, 3u);
        EXPECT_EQ(object_of(table).file_length, read_file(file()).size());

        table = reopened(table);
        ASSERT_NE(table, nullptr);
        EXPECT_EQ(column_names_of(table), columns);
        EXPECT_EQ(object_of(table).change_counter, counter);
        for (const auto & [id, values] : three_rows()) {
            EXPECT_EQ(taken_string(read_key(table, uint32(id), "name")), values.first);
            if (columns.size() > 2) {
                EXPECT_EQ(read_key(table, uint32(id), columns[2]).value.val_int64, values.second);
            }
        }
        EXPECT_EQ(rg_close_table_1(table), 0);
        EXPECT_EQ(rg_delete_table_1(tree, text("/kept/table")), 0);
    }
}

TEST_F(column_changes_of_files, make_the_file_that_a_copy_of_the_table_is)
{
    with_each_change([&](rg_opaque_handle_t table, const column_change & change) {
        ASSERT_EQ(change.make(table), 0);
        ASSERT_EQ(rg_copy_table_by_handle_1(table, text("/kept/copy"), 1), 0);
        EXPECT_EQ(to_hex(read_file(file("copy"))), to_hex(read_file(file())));
    });
}

TEST_F(column_changes_of_files, leave_the_new_file_locked_and_no_descriptor_behind)
{
    with_each_change([&](rg_opaque_handle_t table, const column_change & change) {
        const size_t descriptors = open_descriptors();
        ASSERT_EQ(change.make(table), 0);
        EXPECT_EQ(open_descriptors(), descriptors);
        EXPECT_GE(fcntl(object_of(table).file_fd, F_GETFD), 0);
        EXPECT_EQ(object_of(table).rewrite_file_fd, -1);
        EXPECT_FALSE(another_process_can_lock(file()));
    });
}

TEST_F(column_changes_of_files, that_fail_leave_the_old_file_locked)
{
    with_each_change([&](rg_opaque_handle_t table, const column_change & change) {
        for (const call which : {call::open, call::lockf, call::writev, call::fsync, call::rename}) {
            fail_call(which, 1, EIO);
            EXPECT_EQ(change.make(table), RG_E_SYSTEM_CALL);
            reset_calls();
            EXPECT_FALSE(another_process_can_lock(file()));
        }
    });
}

TEST_F(column_changes_of_files, can_follow_each_other_without_an_open_between)
{
    rg_opaque_handle_t table = filled();
    for (const column_change & change : all_changes()) {
        if (is_deletion(change))
            ASSERT_EQ(delete_columns(table, {"extra"}), 0);
        else
            ASSERT_EQ(change.make(table), 0) << change.name;
        if (change.name == std::string("rename")) {
            ASSERT_EQ(rename_column(table, "value", "val"), 0);
        }
    }
    table = reopened(table);
    ASSERT_NE(table, nullptr);
    EXPECT_EQ(column_names_of(table), (std::vector<std::string>{"id", "name", "val"}));
    EXPECT_EQ(rows_in(table), three_rows());
    EXPECT_EQ(object_of(table).change_counter, 7u) << "the creation, the rows, five changes";
}

TEST_F(column_changes_of_files, keep_definitions_of_structured_data_through_the_file)
{
    two_fields  definition;
    rg_column_t sd                   = column("sd", KT_SD_PTR, RG_STANDARD, null_value());
    sd.sd_defn                       = reinterpret_cast<rg_sd_def_t *>(&definition);
    std::vector<rg_column_t> columns = three_columns();
    columns.insert(columns.begin() + 1, sd);
    rg_opaque_handle_t table = make({false, true}, columns);
    add_rows(table, three_rows());
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    ASSERT_EQ(delete_columns(table, {"name"}), 0); // its name and default go on standing in the record
    ASSERT_EQ(rename_column(table, "sd", "structured"), 0);
    table = reopened(table);
    ASSERT_NE(table, nullptr);
    const description d(table, -1);
    ASSERT_EQ(d->number_of_columns, 4u);
    const rg_column_t & c = d->column_definitions[1];
    EXPECT_STREQ(c.name, "structured");
    ASSERT_EQ(c.sd_defn->number_of_fields, 2u);
    const rg_field_def_t * p_fields = c.sd_defn->fields;
    EXPECT_STREQ(p_fields[0].name, "first");
    EXPECT_STREQ(p_fields[1].name, "second");
}

TEST_F(column_changes_of_files, a_crash_ahead_of_the_rename_leaves_the_old_table_and_behind_it_the_new_one)
{
    rg_opaque_handle_t table  = filled();
    const bytes        before = read_file(file());
    bytes              old_file, rewrite;
    before_call(call::rename, 1, [&] {
        old_file = read_file(file());
        rewrite  = read_file(rewrite_file());
    });
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    EXPECT_EQ(to_hex(old_file), to_hex(before));
    EXPECT_EQ(to_hex(rewrite), to_hex(read_file(file()))) << "it is complete by then";

    const temp_dir           dir;
    open_tree                other_tree;
    const rg_opaque_handle_t other = opened_in(other_tree, old_file, dir);
    ASSERT_NE(other, nullptr);
    EXPECT_EQ(rows_in(other), three_rows());
    EXPECT_EQ(column_names_of(other), (std::vector<std::string>{"id", "name", "val"}));
}

// ---- What stays behind ----

TEST_F(column_changes_of_files, leave_the_applications_data_in_memory_and_out_of_the_file)
{
    kt_binary_t blob{1, {42}};
    const auto  has_blob = [&](rg_opaque_handle_t table) {
        kt_binary_t *    p_binary = nullptr;
        const kt_int32_t rc       = rg_get_application_metadata_1(table, &p_binary);
        const bool       has      = rc == 0 && p_binary != nullptr && p_binary->length == 1;
        std::free(p_binary);
        return has;
    };
    rg_opaque_handle_t table = filled();
    ASSERT_EQ(rg_set_application_metadata_1(table, &blob), 0);
    ASSERT_EQ(commit(table), 0);
    table = reopened(table, explicit_writing);
    ASSERT_TRUE(has_blob(table)) << "the file has it";
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    EXPECT_TRUE(has_blob(table));
    const bytes rewritten = read_file(file());
    {
        const temp_dir dir;
        open_tree      other_tree;
        EXPECT_FALSE(has_blob(opened_in(other_tree, rewritten, dir)));
    }
    // The next commit record has it again.
    ASSERT_EQ(rg_i_apply(&object_of(table), 1, 0), 0);
    ASSERT_EQ(rg_i_commit(&object_of(table)), 0);
    table = reopened(table);
    EXPECT_TRUE(has_blob(table));
}

TEST_F(column_changes_of_files, leave_the_places_of_the_old_files_commit_record_so_that_the_next_append_goes_there)
{
    with_each_change([&](rg_opaque_handle_t table, const column_change & change) {
        const rg_i_table_t before = object_of(table);
        ASSERT_EQ(change.make(table), 0);
        const rg_i_table_t & after = object_of(table);
        EXPECT_EQ(after.disk_commit_record_offset, before.disk_commit_record_offset);
        EXPECT_EQ(after.disk_commit_record_length, before.disk_commit_record_length);
        EXPECT_EQ(after.disk_applied_commit_record_offset, before.disk_applied_commit_record_offset);
        EXPECT_EQ(after.disk_applied_commit_record_length, before.disk_applied_commit_record_length);
        EXPECT_EQ(after.disk_file_length, before.disk_file_length);

        const bytes  rewritten = read_file(file());
        const size_t old_end   = before.disk_commit_record_offset + before.disk_commit_record_length;
        ASSERT_EQ(add_row(table, {{"id", uint32(9)}}), 0);
        ASSERT_EQ(rg_apply_1(table, 0), 0);
        const bytes  written   = read_file(file());
        const size_t unchanged = std::min(old_end, rewritten.size());
        EXPECT_TRUE(
            std::equal(rewritten.begin(), rewritten.begin() + static_cast<std::ptrdiff_t>(unchanged), written.begin()));
        const auto row = std::vector<std::uint8_t>(written.begin() + static_cast<std::ptrdiff_t>(old_end) + 8,
                                                   written.begin() + static_cast<std::ptrdiff_t>(old_end) + 12);
        EXPECT_EQ(row, (bytes{2, 0, 0, 0})) << "a row record stands where the old file ended";
    });
}

TEST_F(column_changes_of_files, are_followed_by_sound_updates_when_the_table_was_closed_and_opened)
{
    rg_opaque_handle_t table = filled();
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0);
    table = reopened(table, implicit_writing);
    ASSERT_EQ(add_row(table, {{"id", uint32(4)}, {"name", string("delta")}, {"val", int64(40)}}), 0);
    table           = reopened(table);
    named_rows rows = three_rows();
    rows[4]         = {"delta", 40};
    EXPECT_EQ(rows_in(table), rows);
}

// ---- Failures ----

TEST_F(column_changes_of_files, that_fail_in_a_call_leave_table_and_file_as_they_were)
{
    struct failure {
        call       which;
        int        the_errno;
        kt_int32_t rc;
    };
    const failure failures[] = {
        {call::open, EIO, RG_E_SYSTEM_CALL},
        {call::open, EACCES, RG_E_ACCESS},
        {call::open, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL},
        {call::lockf, EDEADLK, RG_E_SYSTEM_CALL},
        {call::writev, EIO, RG_E_SYSTEM_CALL},
        {call::writev, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL},
        {call::fsync, EIO, RG_E_SYSTEM_CALL},
        {call::rename, EACCES, RG_E_ACCESS},
        {call::rename, EIO, RG_E_SYSTEM_CALL},
        {call::rename, ENOSPC, RG_E_FILESYSTEM_FULL_DETAIL},
    };
    for (const failure & f : failures)
        with_each_change([&](rg_opaque_handle_t table, const column_change & change) {
            SCOPED_TRACE(std::to_string(static_cast<int>(f.which)) + " with " + std::to_string(f.the_errno));
            const table_picture before      = picture_of(table);
            const auto          columns     = column_names_of(table);
            const bytes         content     = read_file(file());
            const size_t        descriptors = open_descriptors();
            const kt_uint64_t   counter     = object_of(table).change_counter;
            ku_set_no_error_1();
            fail_call(f.which, 1, f.the_errno, for_good);
            EXPECT_EQ(change.make(table), f.rc);
            EXPECT_TRUE(failed_as_asked(f.which));
            reset_calls();
            if (f.rc != RG_E_FILESYSTEM_FULL_DETAIL) {
                EXPECT_EQ(error_code(), f.rc);
            }
            EXPECT_EQ(picture_of(table), before);
            EXPECT_EQ(column_names_of(table), columns);
            EXPECT_EQ(object_of(table).change_counter, counter);
            EXPECT_EQ(to_hex(read_file(file())), to_hex(content));
            EXPECT_FALSE(file_exists(rewrite_file()));
            EXPECT_EQ(open_descriptors(), descriptors);
            // The table goes on working, without another look at its file.
            EXPECT_EQ(set_fields_by_key(table, uint32(1), {{"val", int64(11)}}), 0);
            EXPECT_EQ(commit(table), 0);
            EXPECT_EQ(change.make(table), 0);
        });
}

TEST_F(column_changes_of_files, whose_writes_come_back_short_are_made_whole)
{
    rg_opaque_handle_t table = filled();
    shorten_write(call::writev, 1, 10);
    ASSERT_EQ(add_columns(table, {column("extra", KT_INT32)}), 0) << error_text();
    EXPECT_TRUE(failed_as_asked(call::writev) || calls_made(call::writev) > 1);
    table = reopened(table);
    ASSERT_NE(table, nullptr);
    EXPECT_EQ(rows_in(table), three_rows());
}

} // namespace kt_test
