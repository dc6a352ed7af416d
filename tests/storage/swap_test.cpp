// SPDX-License-Identifier: MIT
// Persistent tables in create and open, and the exchange of contents by which a reader becomes a writer.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

struct exchanging_contents : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    void write_rows(std::uint32_t first, std::uint32_t count)
    {
        file_image image;
        for (std::uint32_t id = first; id < first + count; ++id)
            image.row(0, id, id);
        image.commit(7);
        write_file(r.path, image.content());
    }
    // What another process would do: the file is a different one from now on.
    static rg_i_table_t * opened(const std::string & path, kt_int32_t mode = RG_MODE_WRITE)
    {
        rg_i_table_t * p_table = nullptr;
        EXPECT_EQ(rg_i_open_persistent_table(nullptr, nullptr, text(path), mode, 512, nullptr, &p_table), 0);
        return p_table;
    }
};
struct upgrading_a_reader : exchanging_contents {
};
struct creating_and_opening_under_a_mount_point : exchanging_contents {
};

} // namespace

TEST_F(exchanging_contents, exchanges_the_stated_fields_and_no_others)
{
    write_rows(0, 5);
    rg_i_table_t * p_old = opened(r.path, RG_MODE_READ);
    write_rows(10, 3);
    rg_i_table_t *      p_new      = opened(r.path);
    const rg_i_table_t  old_before = *p_old, new_before = *p_new;
    const kt_uint32_t * p_packed = p_old->p_rows_packed_index;
    ASSERT_EQ(rg_i_swap_after_metadata_update(p_old, p_new), 0);

    const auto exchanged = [&](auto field) {
        EXPECT_EQ(p_old->*field, new_before.*field);
        EXPECT_EQ(p_new->*field, old_before.*field);
    };
    const auto kept = [&](auto field) {
        EXPECT_EQ(p_old->*field, old_before.*field);
        EXPECT_EQ(p_new->*field, new_before.*field);
    };
    using t = rg_i_table_t;
    exchanged(&t::p_metadata_record_data);
    exchanged(&t::p_columns);
    exchanged(&t::total_columns);
    exchanged(&t::total_variable_length_columns);
    exchanged(&t::maximum_rows);
    exchanged(&t::total_applied_rows);
    exchanged(&t::total_committed_rows);
    exchanged(&t::p_rows_fixed_index);
    exchanged(&t::p_rows_hash_table);
    exchanged(&t::p_rows_free_chain);
    exchanged(&t::change_counter);
    exchanged(&t::uncommitted_updates_visible);
    exchanged(&t::commit_record_offset);
    exchanged(&t::applied_commit_record_offset);
    exchanged(&t::commit_record_length);
    exchanged(&t::applied_commit_record_length);
    exchanged(&t::file_length);
    exchanged(&t::rewrite_file_length);
    exchanged(&t::file_fd);
    exchanged(&t::rewrite_file_fd);
    EXPECT_EQ(p_old->record_buffer_pool.p_first_record_buffer, new_before.record_buffer_pool.p_first_record_buffer);
    EXPECT_EQ(p_old->record_buffer_pool.used_bytes, new_before.record_buffer_pool.used_bytes);
    EXPECT_EQ(p_new->record_buffer_pool.p_first_record_buffer, old_before.record_buffer_pool.p_first_record_buffer);
    kept(&t::p_name);
    kept(&t::references);
    kept(&t::mode);
    kept(&t::implicitly_controlled);
    kept(&t::p_tree);
    kept(&t::p_next);
    kept(&t::block_size);
    kept(&t::p_file_path);
    kept(&t::file_path_length);
    kept(&t::p_persistent_table_registry_path);
    kept(&t::p_application_metadata);
    kept(&t::applied_change_counter);
    kept(&t::p_packed_rows_array);
    kept(&t::p_rows_change_list);
    kept(&t::p_delete_rows_change_list);
    kept(&t::disk_commit_record_offset);
    kept(&t::disk_applied_commit_record_offset);
    kept(&t::disk_commit_record_length);
    kept(&t::disk_applied_commit_record_length);
    kept(&t::disk_file_length);
    EXPECT_TRUE(p_packed == p_old->p_rows_packed_index) << "no growth was needed";
    rg_i_close_table(p_old);
    rg_i_close_table(p_new);
}

TEST_F(exchanging_contents, keeps_the_packed_index_and_lets_the_positions_behind_it_hold_their_own_number)
{
    write_rows(0, 3);
    rg_i_table_t * p_old = opened(r.path, RG_MODE_READ);
    // As deletions and additions may have left it.
    p_old->p_rows_packed_index[0] = 2;
    p_old->p_rows_packed_index[2] = 0;
    write_rows(10, 500);
    rg_i_table_t *    p_new  = opened(r.path);
    const kt_uint32_t former = p_old->maximum_rows;
    ASSERT_GT(p_new->maximum_rows, former);
    ASSERT_EQ(rg_i_swap_after_metadata_update(p_old, p_new), 0);
    EXPECT_EQ(p_old->p_rows_packed_index[0], 2u);
    EXPECT_EQ(p_old->p_rows_packed_index[1], 1u);
    EXPECT_EQ(p_old->p_rows_packed_index[2], 0u);
    for (kt_uint32_t i = 3; i < p_old->maximum_rows; ++i)
        EXPECT_EQ(p_old->p_rows_packed_index[i], i);
    EXPECT_EQ(rows_of(p_old).size(), 500u);
    rg_i_close_table(p_old);
    rg_i_close_table(p_new);
}

TEST_F(exchanging_contents, leaves_no_packed_position_that_names_a_slot_outside_a_smaller_row_index)
{
    write_rows(0, 500);
    rg_i_table_t * p_old = opened(r.path, RG_MODE_READ);
    for (kt_uint32_t i = 0; i < 500; ++i)
        p_old->p_rows_packed_index[i] = 499 - i;
    write_rows(10, 5);
    rg_i_table_t * p_new = opened(r.path);
    ASSERT_LT(p_new->maximum_rows, 400u);
    ASSERT_EQ(rg_i_swap_after_metadata_update(p_old, p_new), 0);
    for (kt_uint32_t i = 0; i < p_old->maximum_rows; ++i)
        EXPECT_LT(p_old->p_rows_packed_index[i], p_old->maximum_rows);
    EXPECT_EQ(rows_of(p_old), (rows{{10, 10}, {11, 11}, {12, 12}, {13, 13}, {14, 14}}));
    rg_i_close_table(p_old);
    rg_i_close_table(p_new);
}

TEST_F(exchanging_contents, drops_what_was_pending_in_either)
{
    write_rows(0, 3);
    rg_i_table_t * p_old = opened(r.path, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    write_rows(10, 5);
    rg_i_table_t * p_new = opened(r.path, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    EXPECT_EQ(add(p_old, 4, 4), 0);
    EXPECT_EQ(remove(p_old, 1), 0);
    EXPECT_EQ(rg_i_apply(p_old, 0, 0), 0);
    EXPECT_EQ(set(p_new, 11, 4), 0);
    EXPECT_EQ(remove(p_new, 12), 0);
    ASSERT_EQ(rg_i_swap_after_metadata_update(p_old, p_new), 0);
    for (const rg_i_table_t * p_table : {p_old, p_new}) {
        EXPECT_EQ(p_table->p_rows_change_list, nullptr);
        EXPECT_EQ(p_table->p_rows_change_list_tail, nullptr);
        EXPECT_EQ(p_table->p_delete_rows_change_list, nullptr);
        EXPECT_EQ(p_table->p_delete_rows_change_list_tail, nullptr);
        EXPECT_EQ(p_table->applied_deletions, 0u);
        EXPECT_EQ(p_table->ready_for_commit, 0u);
    }
    for (kt_uint32_t slot = 0; slot < 5; ++slot)
        EXPECT_EQ(+p_old->p_rows_fixed_index[slot].p_pending_change, nullptr) << slot;
    rg_i_close_table(p_new);
    // A change of a row whose entry was dropped gets a new one.
    EXPECT_EQ(set(p_old, 13, 99), 0);
    EXPECT_NE(p_old->p_rows_change_list, nullptr);
    rg_i_close_table(p_old);
}

TEST_F(exchanging_contents, without_memory_for_the_packed_index_gives_12_and_exchanges_nothing)
{
    write_rows(0, 3);
    rg_i_table_t * p_old = opened(r.path, RG_MODE_READ);
    write_rows(10, 500);
    rg_i_table_t *     p_new      = opened(r.path);
    const rg_i_table_t old_before = *p_old;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_swap_after_metadata_update(p_old, p_new), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(p_old->p_rows_fixed_index, old_before.p_rows_fixed_index);
    EXPECT_EQ(p_old->p_rows_packed_index, old_before.p_rows_packed_index);
    EXPECT_EQ(rows_of(p_old), (rows{{0, 0}, {1, 1}, {2, 2}}));
    rg_i_close_table(p_old);
    rg_i_close_table(p_new);
}

TEST_F(upgrading_a_reader, reads_the_file_afresh_so_that_the_readers_handle_sees_the_new_contents)
{
    write_rows(0, 3);
    rg_opaque_handle_t reader = r.open(RG_MODE_READ);
    EXPECT_EQ(add(reader, 9, 9), RG_E_ACCESS);
    write_rows(10, 5);
    rg_opaque_handle_t writer = r.open(RG_MODE_WRITE);
    EXPECT_EQ(writer, reader);
    EXPECT_EQ(object(reader).references, 2u);
    EXPECT_EQ(rows_of(reader), (rows{{10, 10}, {11, 11}, {12, 12}, {13, 13}, {14, 14}}));
    EXPECT_EQ(add(reader, 9, 9), 0) << "and can update";
    EXPECT_EQ(rg_close_table_1(reader), 0);
    EXPECT_EQ(rg_close_table_1(writer), 0);
}

TEST_F(upgrading_a_reader, leaves_the_process_with_the_files_lock)
{
    write_rows(0, 3);
    rg_opaque_handle_t reader = r.open(RG_MODE_READ);
    rg_opaque_handle_t writer = r.open(RG_MODE_WRITE);
    const pid_t        child  = fork();
    if (child == 0) {
        const int fd = ::open(r.path.c_str(), O_RDWR);
        _exit(lockf(fd, F_TEST, 0) == 0 ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_EQ(rg_close_table_1(reader), 0);
    EXPECT_EQ(rg_close_table_1(writer), 0);
}

TEST_F(upgrading_a_reader, keeps_the_file_offsets_of_the_first_open_so_that_what_others_wrote_since_is_overwritten)
{
    write_rows(0, 1);
    rg_opaque_handle_t reader = r.open(RG_MODE_READ);
    // Another process commits a row.
    bytes      content = read_file(r.path);
    file_image image(content);
    image.at(91 + 32 + 8, 0);
    image.row(0, 1, 1);
    image.commit(8);
    write_file(r.path, image.content());
    rg_opaque_handle_t writer = r.open(RG_MODE_WRITE);
    EXPECT_EQ(object(writer).total_applied_rows, 2u);
    EXPECT_EQ(object(writer).disk_commit_record_offset, 91u + 32) << "the live one stands behind";
    EXPECT_EQ(add(writer, 2, 2), 0);
    EXPECT_EQ(state_in(r.dir.path()).rows, (std::map<std::uint32_t, std::int64_t>{{0, 0}, {2, 2}}))
        << "row 1 is lost: who means to write opens for writing at once";
    EXPECT_EQ(rg_close_table_1(reader), 0);
    EXPECT_EQ(rg_close_table_1(writer), 0);
}

TEST_F(upgrading_a_reader, that_fails_leaves_the_table_open_for_reading_with_one_reference_too_many)
{
    write_rows(0, 3);
    rg_opaque_handle_t reader = r.open(RG_MODE_READ);
    for (const auto & [which, code] :
         {std::pair{call::open, RG_E_ACCESS}, {call::lockf, RG_E_SYSTEM_CALL}, {call::read, RG_E_SYSTEM_CALL}}) {
        const kt_uint32_t references = object(reader).references;
        reset_calls();
        fail_call(which, 1, code == RG_E_ACCESS ? EACCES : EIO);
        kt_int32_t rc = 0;
        EXPECT_EQ(r.open(RG_MODE_WRITE, &rc), nullptr);
        EXPECT_EQ(rc, code);
        EXPECT_EQ(object(reader).references, references + 1);
        EXPECT_EQ(object(reader).mode & RG_MODE_WRITE, 0u);
        EXPECT_EQ(rows_of(reader), (rows{{0, 0}, {1, 1}, {2, 2}}));
    }
    reset_calls();
    rg_opaque_handle_t writer = r.open(RG_MODE_WRITE);
    EXPECT_EQ(writer, reader);
    EXPECT_EQ(rows_of(reader), (rows{{0, 0}, {1, 1}, {2, 2}}));
}

TEST_F(upgrading_a_reader, gives_12_for_each_failed_allocation_and_leaves_it_readable)
{
    write_rows(0, 3);
    rg_opaque_handle_t reader = r.open(RG_MODE_READ);
    write_rows(0, 500); // so that the packed index has to grow
    for (unsigned nth = 1;; ++nth) {
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        rg_opaque_handle_t writer = nullptr;
        const kt_int32_t   rc     = rg_open_table_1(r.tree, text("/r/t"), RG_MODE_WRITE, &writer);
        const bool         failed = failed_as_asked(call::allocation);
        reset_calls();
        if (!failed) {
            EXPECT_EQ(rc, 0);
            EXPECT_EQ(rows_of(writer).size(), 500u);
            break;
        }
        EXPECT_EQ(rc, RG_E_NO_MEMORY) << nth;
        EXPECT_EQ(rows_of(reader).size(), 3u) << nth;
    }
}

TEST_F(creating_and_opening_under_a_mount_point, an_existing_file_that_is_not_open_gives_201)
{
    write_rows(0, 3);
    const bytes content = read_file(r.path);
    kt_int32_t  rc      = 0;
    EXPECT_EQ(create_table(r.tree, "/r/t", example_columns(), RG_MODE_WRITE, &rc), nullptr);
    EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
    EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
    EXPECT_EQ(read_file(r.path), content);
}

TEST_F(creating_and_opening_under_a_mount_point, a_stat_without_permission_gives_201_and_not_206)
{
    for (const int the_errno : {EACCES, EIO, ELOOP}) {
        fail_call(call::stat, 1, the_errno);
        kt_int32_t rc = 0;
        EXPECT_EQ(create_table(r.tree, "/r/t", example_columns(), RG_MODE_WRITE, &rc), nullptr);
        EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
        EXPECT_FALSE(file_exists(r.path));
    }
}

TEST_F(creating_and_opening_under_a_mount_point, packed_rows_give_15_without_a_record)
{
    auto               columns = example_columns();
    kt_array_t         packed  = {};
    rg_opaque_handle_t table   = nullptr;
    ku_set_no_error_1();
    EXPECT_EQ(rg_x_create_table(r.tree, text("/r/t"), columns.data(), 2, RG_MODE_WRITE, nullptr, &packed, &table),
              RG_E_INTERNAL);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(table, nullptr);
    EXPECT_FALSE(file_exists(r.path));
}

TEST_F(creating_and_opening_under_a_mount_point, a_table_that_is_not_there_gives_200)
{
    EXPECT_EQ(r.try_open(RG_MODE_READ), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(r.try_open(RG_MODE_WRITE), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(error_code(), RG_E_NO_SUCH_TABLE);
    EXPECT_FALSE(file_exists(r.path));
}

TEST_F(creating_and_opening_under_a_mount_point, a_creation_that_the_tree_cannot_take_leaves_its_file)
{
    const size_t descriptors = open_descriptors();
    bool         seen        = false;
    for (unsigned nth = 1; nth < 60 && !seen; ++nth) {
        std::filesystem::remove(r.path);
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        kt_int32_t         rc    = 0;
        rg_opaque_handle_t table = create_table(r.tree, "/r/t", example_columns(), RG_MODE_WRITE, &rc);
        reset_calls();
        if (table != nullptr) {
            EXPECT_EQ(rg_close_table_1(table), 0);
        } else {
            EXPECT_EQ(rc, RG_E_NO_MEMORY);
            seen = file_exists(r.path);
        }
        EXPECT_EQ(open_descriptors(), descriptors);
    }
    EXPECT_TRUE(seen) << "the last allocation is that of the tree";
    EXPECT_EQ(state_in(r.dir.path()), (file_state{0, 1, {}}));
}
