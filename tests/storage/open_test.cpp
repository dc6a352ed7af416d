// SPDX-License-Identifier: MIT
// Opening table files: the replay, and every fault on the way.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

struct opening_a_table_file : testing::Test {
    registry_at       r;
    working_directory here;
    fault_scope       faults;

    void write(const file_image & image) { write_file(r.path, image.content()); }
    // A refusal leaves nothing open, and the file as it was.
    void expect_refusal(kt_int32_t code, kt_int32_t mode = RG_MODE_WRITE)
    {
        const size_t descriptors = open_descriptors();
        ku_set_no_error_1();
        EXPECT_EQ(r.try_open(mode), code);
        EXPECT_EQ(error_code(), code);
        EXPECT_EQ(open_descriptors(), descriptors);
    }
};

file_image example_with_a_row()
{
    file_image image;
    image.old_commit(1);
    image.row(0, 7, -2);
    image.commit(2);
    return image;
}

} // namespace

TEST_F(opening_a_table_file, reads_it_with_one_read_and_writes_nothing)
{
    write(example_with_a_row());
    const bytes before = read_file(r.path);
    for (const kt_int32_t mode : {RG_MODE_READ, RG_MODE_WRITE}) {
        reset_calls();
        rg_opaque_handle_t table = r.open(mode);
        EXPECT_EQ(calls_made(call::read), 1u);
        EXPECT_EQ(calls_made(call::open), 1u);
        EXPECT_EQ(calls_made(call::lockf), mode == RG_MODE_WRITE ? 1u : 0u) << "a reader takes no lock";
        EXPECT_EQ(calls_made(call::write) + calls_made(call::writev) + calls_made(call::fsync) +
                      calls_made(call::ftruncate) + calls_made(call::rename),
                  0u);
        EXPECT_EQ(rows_of(table), (rows{{7, -2}}));
        EXPECT_EQ(rg_close_table_1(table), 0);
    }
    EXPECT_EQ(read_file(r.path), before);
}

TEST_F(opening_a_table_file, takes_the_figures_of_the_file_and_of_its_image_in_memory)
{
    write(example_with_a_row());
    rg_opaque_handle_t   handle = r.open(RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL);
    const rg_i_table_t & table  = object(handle);
    EXPECT_EQ(table.disk_commit_record_offset, 147u);
    EXPECT_EQ(table.disk_commit_record_length, 24u);
    EXPECT_EQ(table.disk_applied_commit_record_offset, 147u);
    EXPECT_EQ(table.disk_applied_commit_record_length, 24u);
    EXPECT_EQ(table.disk_file_length, 171u);
    // 8 bytes a record and 12 a column more: the metadata, the old commit record and the row lie ahead.
    EXPECT_EQ(table.commit_record_offset, 147u + 3 * 8 + 2 * 12);
    EXPECT_EQ(table.commit_record_length, 32u);
    EXPECT_EQ(table.file_length, 171u + 4 * 8 + 2 * 12);
    EXPECT_EQ(table.change_counter, 2u);
    EXPECT_EQ(table.ready_for_commit, 0u);
    EXPECT_EQ(table.total_applied_rows, 1u);
    EXPECT_EQ(table.total_committed_rows, 1u);
    EXPECT_EQ(table.implicitly_controlled, 0u);
    EXPECT_EQ(table.references, 1u);
    EXPECT_EQ(table.p_rows_change_list, nullptr);
    EXPECT_EQ(table.p_delete_rows_change_list, nullptr);
    EXPECT_EQ(table.total_columns, 2u);
    EXPECT_EQ(table.total_variable_length_columns, 0u);
    EXPECT_STREQ(table.p_file_path, r.path.c_str());
    EXPECT_STREQ(table.p_persistent_table_registry_path, "/r/t");
    const rg_i_index_entry_t & entry = table.p_rows_fixed_index[0];
    EXPECT_EQ(+entry.p_applied, +entry.p_committed);
    EXPECT_EQ(+entry.file_offset, 115u);
    EXPECT_EQ(+rg_i_record_head(entry.p_applied)->disk_table_offset, 115u);
    // The image is a near copy of the file: the row is record 2, of a table of 2 columns.
    EXPECT_EQ(+entry.p_applied, table.p_metadata_record_data + 115 + 8 * 2 + 12 * 2);
    EXPECT_EQ(rg_close_table_1(handle), 0);
}

TEST_F(opening_a_table_file, counts_as_used_what_is_alive_and_the_heads)
{
    write(example_with_a_row());
    rg_opaque_handle_t                handle = r.open(RG_MODE_READ);
    const rg_i_record_buffer_pool_t & pool   = object(handle).record_buffer_pool;
    kt_uint32_t                       free   = 0;
    for (kt_char_ptr_t p = pool.p_free_chain; p != nullptr; p = reinterpret_cast<rg_i_record_metadata_t *>(p)->p_next)
        free += reinterpret_cast<rg_i_record_metadata_t *>(p)->record_length - 20;
    EXPECT_EQ(pool.used_bytes, pool.total_bytes - free);
    // The image's block has a free record where the old commit record was, and one from the live one on; the other
    // block is all free, for rows to come.
    EXPECT_EQ(pool.used_bytes, (12u + 123 + 20 + 40 + 20) + 32);
    EXPECT_EQ(rg_close_table_1(handle), 0);
}

TEST_F(opening_a_table_file, of_12_bytes_or_fewer_gives_14)
{
    for (size_t length = 0; length <= 12; ++length) {
        write_file(r.path, bytes(length, 0x11));
        expect_refusal(RG_E_TABLE_UNREADABLE);
    }
}

TEST_F(opening_a_table_file, of_13_bytes_is_left_to_the_walk)
{
    bytes content = file_image().content();
    content.resize(13);
    write_file(r.path, content);
    expect_refusal(RG_E_NO_COMMIT_RECORD);
    EXPECT_EQ(error_message_index(), 19);
    write_file(r.path, bytes(13, 0));
    expect_refusal(RG_E_TABLE_UNREADABLE);
}

TEST_F(opening_a_table_file, without_rows_has_100_slots_or_those_that_the_commit_record_has_room_for)
{
    file_image image;
    image.commit(1);
    write(image);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(object(table).maximum_rows, 100u) << "32 bytes of commit record and 36 a row";
    EXPECT_EQ(rg_close_table_1(table), 0);

    file_image with_blob;
    with_blob.record(0xFFFFFFFF, file_image(bytes{}).word(8 + 4 + 8 + 44).wide(1).word(1).word(0).word(44).content());
    bytes content = with_blob.content();
    content.resize(content.size() + 44);
    write_file(r.path, file_image(content).at(91, 24 + 4 + 8 + 44).content());
    table = r.open(RG_MODE_READ);
    EXPECT_EQ(object(table).maximum_rows, (24u + 4 + 8 + 44 + 8) / 36);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, frees_a_version_that_a_later_one_of_the_same_group_replaces)
{
    file_image image;
    image.old_commit(1);
    const std::uint32_t first  = image.row(0, 7, 1);
    const std::uint32_t second = image.row(first, 7, 2);
    image.row(second, 7, 3);
    image.commit(2);
    EXPECT_EQ(image.state(), (file_state{0, 2, {{7, 3}}}));

    write(image);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(+object(table).p_rows_fixed_index[0].file_offset, second + 32);
    EXPECT_EQ(object(table).record_buffer_pool.used_bytes, (12u + 123 + 20 + 40 + 20) + 32);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, lets_a_version_name_any_earlier_version_of_its_row)
{
    file_image          image;
    const std::uint32_t first = image.row(0, 7, 1);
    image.row(first, 7, 2);
    image.row(first, 7, 3);
    image.commit(2);
    EXPECT_EQ(image.state(), (file_state{0, 2, {{7, 3}}}));
}

TEST_F(opening_a_table_file, gives_a_new_row_the_lowest_free_slot_which_may_be_a_deleted_one)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    image.row(0, 2, 20);
    image.old_commit(2);
    image.deleted_rows({a});
    image.old_commit(3);
    image.row(0, 3, 30);
    image.row(0, 4, 40);
    image.commit(4);
    write(image);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(rows_of(table), (rows{{3, 30}, {2, 20}, {4, 40}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, whose_rows_were_all_deleted_gives_an_empty_table)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    const std::uint32_t b = image.row(0, 2, 20);
    image.old_commit(2);
    image.deleted_rows({b, a});
    image.commit(3);
    EXPECT_EQ(image.state(), (file_state{0, 3, {}}));
}

TEST_F(opening_a_table_file, takes_the_count_of_deletions_off_also_for_a_row_that_is_gone)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    image.row(0, 2, 20);
    image.old_commit(2);
    image.deleted_rows({a, a});
    image.commit(3);
    write(image);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(object(table).total_applied_rows, 0u) << "though one row is still there";
    EXPECT_NE(+object(table).p_rows_fixed_index[1].p_committed, nullptr);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, refuses_more_deletions_than_rows)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    image.deleted_rows({a, a});
    image.commit(3);
    write(image);
    expect_refusal(RG_E_TABLE_UNREADABLE);
}

TEST_F(opening_a_table_file, lets_a_version_of_a_deleted_row_bring_it_back)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    image.row(0, 2, 20);
    image.deleted_rows({a});
    image.row(a, 1, 11);
    image.row(0, 3, 30);
    image.commit(3);
    EXPECT_EQ(image.state(), (file_state{0, 3, {{1, 11}, {2, 20}, {3, 30}}}));
}

TEST_F(opening_a_table_file, lets_a_version_take_the_slot_that_another_row_got_from_a_deleted_one)
{
    // What a version names decides by its slot, whoever stands there by then.
    file_image          image;
    const std::uint32_t a = image.row(0, 1, 10);
    image.deleted_rows({a});
    image.row(0, 2, 20);
    image.row(a, 1, 11);
    image.commit(3);
    EXPECT_EQ(image.state(), (file_state{0, 3, {{1, 11}}}));
}

TEST_F(opening_a_table_file, looks_at_nothing_behind_the_live_commit_record)
{
    file_image image = example_with_a_row();
    image.row(0x12345678, 8, 1);
    image.record(77, {}, 3);
    image.commit(9);
    EXPECT_EQ(image.state(), (file_state{0, 2, {{7, -2}}}));
}

TEST_F(opening_a_table_file, takes_the_first_of_two_live_commit_records)
{
    file_image image;
    image.commit(1);
    image.row(0, 7, -2);
    image.commit(2);
    EXPECT_EQ(image.state(), (file_state{0, 1, {}}));
}

TEST_F(opening_a_table_file, does_not_look_at_the_first_records_type_nor_at_next_offset_nor_at_the_byte_order)
{
    file_image image = example_with_a_row();
    image.at(8, 0xFFFFFFFF).at(4, 99).at(12, 1).at(115 + 4, 1234);
    EXPECT_EQ(image.state(), (file_state{0, 2, {{7, -2}}}));
}

TEST_F(opening_a_table_file, maps_the_errno_of_open)
{
    write(example_with_a_row());
    fail_call(call::open, 1, EACCES);
    expect_refusal(RG_E_ACCESS);
    fail_call(call::open, 1, ENOENT);
    expect_refusal(RG_E_NO_SUCH_TABLE);
    fail_call(call::open, 1, ENOSPC);
    expect_refusal(RG_E_FILESYSTEM_FULL_DETAIL);
    for (const int the_errno : {EMFILE, EROFS, ELOOP}) {
        fail_call(call::open, 1, the_errno);
        expect_refusal(RG_E_SYSTEM_CALL);
        EXPECT_NE(error_text().find("The open system call"), std::string::npos);
    }
}

TEST_F(opening_a_table_file, reports_each_failing_call_by_its_name_and_closes_the_file)
{
    write(example_with_a_row());
    for (const int the_errno : {EIO, EINTR, EDEADLK, ENOLCK, ESTALE}) {
        fail_call(call::lockf, 1, the_errno);
        expect_refusal(RG_E_SYSTEM_CALL);
        EXPECT_NE(
            error_text().find("The lockf system call unexpectedly returned an errno of " + std::to_string(the_errno)),
            std::string::npos);
        for (unsigned nth : {1, 2}) {
            fail_call(call::lseek, nth, the_errno);
            expect_refusal(RG_E_SYSTEM_CALL);
            EXPECT_NE(error_text().find("The lseek64 system call"), std::string::npos);
        }
        // Not retried, an interruption neither.
        fail_call(call::read, 1, the_errno);
        expect_refusal(RG_E_SYSTEM_CALL);
        EXPECT_NE(error_text().find("The read system call"), std::string::npos);
    }
    EXPECT_EQ(r.try_open(RG_MODE_WRITE), 0);
}

TEST_F(opening_a_table_file, gives_12_for_each_failed_allocation_and_leaves_nothing)
{
    file_image          image;
    const std::uint32_t a = image.row(0, 7, 1);
    image.row(a, 7, 2);
    image.deleted_rows({a});
    image.row(0, 8, 1);
    image.commit(2);
    write(image);
    const size_t descriptors = open_descriptors();
    for (unsigned nth = 1;; ++nth) {
        rg_opaque_handle_t table = nullptr;
        reset_calls();
        fail_call(call::allocation, nth, ENOMEM);
        const kt_int32_t rc =
            rg_open_hashed_key_table_1(r.tree, text("/r/t"), RG_MODE_WRITE, 1024, hash_uint32, compare_uint32, &table);
        const bool failed = failed_as_asked(call::allocation);
        reset_calls();
        if (rc == 0) {
            EXPECT_EQ(rows_of(table), (rows{{8, 1}}));
            EXPECT_EQ(rg_close_table_1(table), 0);
        } else {
            EXPECT_EQ(rc, RG_E_NO_MEMORY) << nth;
            EXPECT_EQ(error_code(), RG_E_NO_MEMORY) << nth;
        }
        EXPECT_EQ(open_descriptors(), descriptors) << nth;
        if (!failed) {
            EXPECT_GT(nth, 12u);
            break;
        }
    }
}

TEST_F(opening_a_table_file, under_no_name_gives_101_and_closes_the_hash_table)
{
    rg_i_table_t *    p_table      = nullptr;
    rg_hash_table_t * p_hash_table = nullptr;
    ASSERT_EQ(rg_i_hash_table_open(16, hash_uint32, compare_uint32, &p_hash_table), 0);
    EXPECT_EQ(rg_i_open_persistent_table(nullptr, nullptr, nullptr, RG_MODE_READ, 512, p_hash_table, &p_table),
              RG_E_NULL_POINTER);
    EXPECT_EQ(p_table, nullptr);
}

TEST_F(opening_a_table_file, without_a_registry_path_is_allowed)
{
    write(example_with_a_row());
    rg_i_table_t * p_table = nullptr;
    ASSERT_EQ(rg_i_open_persistent_table(nullptr, nullptr, text(r.path), RG_MODE_READ, 512, nullptr, &p_table), 0);
    EXPECT_EQ(p_table->p_persistent_table_registry_path, nullptr);
    EXPECT_EQ(p_table->references, 1u);
    EXPECT_EQ(rg_i_close_table(p_table), 0);
}

TEST_F(opening_a_table_file, that_grows_past_the_buffer_meanwhile_reads_it_again)
{
    write(example_with_a_row());
    before_call(call::read, 1, [&] {
        // Another process commits a long transaction after the length was taken.
        file_image image = example_with_a_row();
        image.at(147 + 8, 0);
        for (std::uint32_t id = 100; id < 300; ++id)
            image.row(0, id, id);
        image.commit(3);
        write(image);
    });
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(calls_made(call::read), 2u);
    EXPECT_EQ(object(table).total_applied_rows, 201u);
    EXPECT_EQ(object(table).disk_file_length, 171u + 200 * 32 + 24);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, that_grows_by_less_meanwhile_reads_what_was_added)
{
    // The length alone would end ahead of the live commit record.
    write(example_with_a_row());
    before_call(call::read, 1, [&] {
        file_image image = example_with_a_row();
        image.at(147 + 8, 0).row(0, 8, 8);
        image.commit(3);
        write(image);
    });
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(calls_made(call::read), 1u);
    EXPECT_EQ(rows_of(table), (rows{{7, -2}, {8, 8}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, that_grows_by_exactly_the_spare_room_reads_it_again)
{
    write(example_with_a_row());
    before_call(call::read, 1, [&] {
        bytes content = example_with_a_row().content();
        content.resize(content.size() + 4096);
        write_file(r.path, content);
    });
    EXPECT_EQ(r.try_open(), 0);
    EXPECT_EQ(calls_made(call::read), 2u);
}

TEST_F(opening_a_table_file, that_is_cut_meanwhile_gives_a_code)
{
    write(example_with_a_row());
    for (const size_t length : {0u, 12u, 13u, 91u, 100u, 170u}) {
        before_call(call::read, 1, [&] {
            bytes content = example_with_a_row().content();
            content.resize(length);
            write_file(r.path, content);
        });
        const kt_int32_t rc = r.try_open();
        EXPECT_TRUE(rc == RG_E_TABLE_UNREADABLE || rc == RG_E_NO_COMMIT_RECORD) << length << ": " << rc;
        write(example_with_a_row());
    }
}

TEST_F(opening_a_table_file, keyed_by_resource_handle_makes_its_hash_table)
{
    rg_opaque_handle_t table = create_table(
        r.tree, "/r/t", {column("id", KT_RSRC_HANDLE_PTR, RG_PRIMARY_KEY), column("val", KT_INT64)}, RG_MODE_WRITE);
    kt_resource_handle_t handle = {1, {2, 3, 4, 5}};
    kt_value_t           key    = uint64(0);
    key.ptr_rsrc_handle         = &handle;
    ASSERT_EQ(add_row(table, {{"id", key}, {"val", int64(6)}}), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    table = r.open(RG_MODE_READ);
    EXPECT_NE(object(table).p_rows_hash_table, nullptr);
    kt_value_t val;
    EXPECT_EQ(rg_get_field_by_key_1(table, key, text("val"), &val), 0);
    EXPECT_EQ(val.val_int64, 6);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, with_one_key_twice_gives_108_without_a_record_if_it_is_hashed)
{
    file_image image;
    image.row(0, 7, 1);
    image.row(0, 7, 2);
    image.commit(1);
    write(image);
    rg_opaque_handle_t table = nullptr;
    ku_set_no_error_1();
    const size_t descriptors = open_descriptors();
    EXPECT_EQ(rg_open_hashed_key_table_1(r.tree, text("/r/t"), RG_MODE_READ, 1024, hash_uint32, compare_uint32, &table),
              RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(open_descriptors(), descriptors);
    EXPECT_EQ(r.try_open(), 0) << "without a hash table nobody looks";
}

TEST_F(opening_a_table_file, brings_back_columns_defaults_definitions_and_the_applications_data)
{
    rg_sd_def_t * p_defn     = static_cast<rg_sd_def_t *>(std::malloc(sizeof(rg_sd_def_t) + sizeof(rg_field_def_t)));
    p_defn->number_of_fields = 2;
    p_defn->fields[0]        = {KT_INT32, text("first")};
    p_defn->fields[1]        = {KT_CHAR_PTR, text("second")};
    rg_column_t sd           = column("sd", KT_SD_PTR, RG_STANDARD, null_value());
    sd.sd_defn               = p_defn;
    rg_column_t text_column  = column("text", KT_CHAR_PTR, RG_STANDARD | RG_PROTECTED, string("a default"));
    text_column.properties   = -17;
    rg_opaque_handle_t table =
        create_table(r.tree, "/r/t", {column("id", KT_UINT32, RG_PRIMARY_KEY), text_column, sd}, RG_MODE_WRITE);
    std::free(p_defn);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(2)}, {"text", string("another")}}), 0);
    struct {
        kt_uint32_t length  = 5;
        char        data[8] = "12345";
    } blob;
    ASSERT_EQ(rg_set_application_metadata_1(table, reinterpret_cast<kt_binary_t *>(&blob)), 0);
    const bytes before(object(table).p_metadata_record_data, object(table).p_metadata_record_data + 16);
    EXPECT_EQ(rg_close_table_1(table), 0);

    table                      = r.open(RG_MODE_READ);
    const rg_i_table_t & again = object(table);
    EXPECT_EQ(bytes(again.p_metadata_record_data, again.p_metadata_record_data + 16), before);
    EXPECT_EQ(again.total_variable_length_columns, 2u);
    EXPECT_STREQ(again.p_columns[1].name, "text");
    EXPECT_EQ(again.p_columns[1].type, KT_CHAR_PTR);
    EXPECT_EQ(again.p_columns[1].qualifier, kt_uint32_t{RG_STANDARD | RG_PROTECTED});
    EXPECT_EQ(again.p_columns[1].properties, -17);
    EXPECT_EQ(again.p_columns[1].sd_defn, nullptr);
    const auto * p_packed = reinterpret_cast<const char *>(again.p_columns[2].sd_defn);
    EXPECT_EQ(rg_i_load_u32(p_packed), 2u);
    EXPECT_EQ(rg_i_load_u32(p_packed + 4), kt_uint32_t{KT_INT32});
    EXPECT_STREQ(p_packed + 8, "first");
    EXPECT_STREQ(p_packed + 8 + 6 + 4, "second");
    kt_value_t value;
    ASSERT_EQ(rg_get_field_by_key_1(table, uint32(1), text("text"), &value), 0);
    EXPECT_STREQ(value.ptr_char, "a default");
    std::free(value.ptr_char);
    ASSERT_EQ(rg_get_field_by_key_1(table, uint32(2), text("text"), &value), 0);
    EXPECT_STREQ(value.ptr_char, "another");
    std::free(value.ptr_char);
    kt_binary_t * p_blob = nullptr;
    ASSERT_EQ(rg_get_application_metadata_1(table, &p_blob), 0);
    EXPECT_EQ(p_blob->length, 5u);
    EXPECT_EQ(std::memcmp(p_blob->data, "12345", 5), 0);
    std::free(p_blob);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(opening_a_table_file, with_no_default_data_has_the_first_name_at_offset_0)
{
    EXPECT_EQ(rg_close_table_1(r.create()), 0);
    const bytes content = read_file(r.path);
    EXPECT_EQ(rg_i_load_u32(content.data() + 28), 0u);
}

TEST_F(opening_a_table_file, of_200000_updates_of_a_thousand_rows_costs_no_square)
{
    file_image                 image;
    std::vector<std::uint32_t> last(1000, 0);
    for (std::uint32_t i = 0; i < 200000; ++i)
        last[i % 1000] = image.row(last[i % 1000], i % 1000, i);
    image.commit(1);
    write(image);
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(object(table).total_applied_rows, 1000u);
    kt_value_t val;
    EXPECT_EQ(rg_get_field_by_index_1(table, 999, text("val"), &val), 0);
    EXPECT_EQ(val.val_int64, 199999);
    EXPECT_EQ(rg_close_table_1(table), 0);
}
