// SPDX-License-Identifier: MIT
// Creating, opening, upgrading and closing tables under a mount point: what the tree and the shared object do around
// the file.
#include <fcntl.h>
#include <search.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "parts.h"
#include "rg_i_tree.h"
#include "support/allocations.h"

using namespace kt_test;

namespace
{

constexpr kt_int32_t explicit_write = RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

std::vector<rg_column_t> columns()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("v", KT_INT64)};
}

void add(rg_opaque_handle_t table, kt_uint32_t id)
{
    ASSERT_EQ(add_row(table, {{"id", uint32(id)}, {"v", int64(kt_int64_t{id} * 10)}}), 0) << error_text();
}

// The values that a table shows by packed index.
std::vector<kt_int64_t> values_of(rg_opaque_handle_t table)
{
    std::vector<kt_int64_t> values;
    for (kt_int32_t row = 0;; ++row) {
        kt_value_t       value = int64(0);
        const kt_int32_t rc    = rg_get_field_by_index_1(table, row, text("v"), &value);
        if (rc == RG_E_NO_SUCH_INDEX)
            return values;
        EXPECT_EQ(rc, 0) << error_text();
        values.push_back(rc == 0 ? value.val_int64 : -1);
    }
}

kt_int64_t value_by_key(rg_opaque_handle_t table, kt_uint32_t id)
{
    kt_value_t value = int64(-1);
    return rg_get_field_by_key_1(table, uint32(id), text("v"), &value) == 0 ? value.val_int64 : -1;
}

using int64s = std::vector<kt_int64_t>;

rg_i_tree_t & tree_object(rg_opaque_handle_t tree)
{
    return *static_cast<rg_i_tree_t *>(tree);
}

kt_int32_t open_code(rg_opaque_handle_t tree, kt_int32_t mode, rg_opaque_handle_t * p_handle)
{
    return rg_open_table_1(tree, text("m/t"), mode, p_handle);
}

kt_int32_t open_hashed_code(rg_opaque_handle_t tree, kt_int32_t mode, rg_opaque_handle_t * p_handle)
{
    return rg_open_hashed_key_table_1(tree, text("m/t"), mode, 1024, hash_uint32, compare_uint32, p_handle);
}

// Whether another process is kept from locking the file.
bool is_locked(const std::string & path)
{
    const pid_t child = fork();
    if (child == 0) {
        const int fd = open(path.c_str(), O_RDWR);
        _exit(fd >= 0 && lockf(fd, F_TEST, 0) == 0 ? 0 : 1);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    return status != 0;
}

size_t open_descriptors()
{
    size_t count = 0;
    for ([[maybe_unused]] const auto & entry : std::filesystem::directory_iterator("/proc/self/fd"))
        ++count;
    return count;
}

// A directory with a table of one row in it, and two trees that mount it.
class tables_with_files : public testing::Test
{
  protected:
    tables_with_files()
    {
        tree.mount("m", dir.path());
        other.mount("m", dir.path());
        const rg_opaque_handle_t table = create_table(other, "m/t", columns(), RG_MODE_WRITE);
        add(table, 1);
        EXPECT_EQ(rg_close_table_1(table), 0);
    }
    // Adds rows as another process would: through an object of its own.
    void add_elsewhere(std::initializer_list<kt_uint32_t> ids)
    {
        const rg_opaque_handle_t table = open_table(other, "m/t", RG_MODE_WRITE);
        for (const kt_uint32_t id : ids)
            add(table, id);
        EXPECT_EQ(rg_close_table_1(table), 0);
    }
    std::string file() const { return dir.file("t"); }

    temp_dir  dir;
    open_tree tree;
    open_tree other;
};

} // namespace

// ---- Creating ----

TEST_F(tables_with_files, are_not_created_over_a_file_that_isnt_open)
{
    const bytes before = read_file(file());
    kt_int32_t  rc     = 0;
    create_table(tree, "m/t", columns(), RG_MODE_WRITE, &rc);
    EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
    EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
    EXPECT_EQ(read_file(file()), before);
}

TEST_F(tables_with_files, are_not_created_where_permission_keeps_stat_from_answering_and_that_is_201_not_206)
{
    for (const int the_errno : {EACCES, ELOOP, EIO}) {
        fault_scope faults;
        fail_call(call::stat, 1, the_errno);
        kt_int32_t rc = 0;
        create_table(tree, "m/new", columns(), RG_MODE_WRITE, &rc);
        EXPECT_EQ(rc, RG_E_TABLE_EXISTS) << the_errno;
        EXPECT_EQ(error_code(), RG_E_TABLE_EXISTS);
        EXPECT_FALSE(file_exists(dir.file("new")));
    }
}

TEST_F(tables_with_files, are_not_made_of_packed_rows_and_that_has_no_error_record)
{
    auto               list = columns();
    kt_array_t         rows{};
    rg_opaque_handle_t handle       = nullptr;
    rg_hash_table_t *  p_hash_table = nullptr;
    ASSERT_EQ(rg_i_hash_table_open(16, hash_uint32, compare_uint32, &p_hash_table), 0);
    ku_set_no_error_1();
    EXPECT_EQ(rg_x_create_table(tree, text("m/new"), list.data(), 2, RG_MODE_WRITE, p_hash_table, &rows, &handle),
              RG_E_INTERNAL);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(handle, nullptr);
    EXPECT_FALSE(file_exists(dir.file("new")));
}

TEST_F(tables_with_files, are_known_by_their_file_and_remember_their_registry_path)
{
    const rg_opaque_handle_t table = create_table(tree, "m/a/b", columns(), RG_MODE_WRITE);
    EXPECT_STREQ(object(table).p_name, dir.file("a,b").c_str());
    EXPECT_STREQ(object(table).p_persistent_table_registry_path, "m/a/b");
    EXPECT_EQ(object(table).block_size, 512u);
    EXPECT_TRUE(file_exists(dir.file("a,b")));
    kt_int32_t rc = 0;
    create_table(tree, "m/a/b", columns(), RG_MODE_WRITE, &rc);
    EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
}

TEST_F(tables_with_files, created_without_memory_are_not_in_the_tree_though_the_file_may_be_there)
{
    const size_t descriptors = open_descriptors();
    bool         file_stayed = false;
    fail_each_allocation(
        [&] {
            std::filesystem::remove(dir.file("new"));
            auto               list   = columns();
            rg_opaque_handle_t handle = nullptr;
            const kt_int32_t rc = rg_create_hashed_key_table_1(tree, text("m/new"), list.data(), 2, RG_MODE_WRITE, 1024,
                                                               hash_uint32, compare_uint32, &handle);
            EXPECT_EQ(handle != nullptr, rc == 0);
            return rc;
        },
        [&](kt_int32_t rc) {
            EXPECT_FALSE(file_exists(dir.file("new.rewrite")));
            EXPECT_EQ(open_descriptors(), descriptors + (rc == 0 ? 1 : 0));
            if (rc != 0 && file_exists(dir.file("new"))) {
                file_stayed                    = true;
                const rg_opaque_handle_t table = open_table(tree, "m/new", RG_MODE_READ);
                EXPECT_EQ(values_of(table), int64s{});
                EXPECT_EQ(rg_close_table_1(table), 0);
            }
        });
    EXPECT_TRUE(file_stayed) << "the tree's own allocation is the last one";
}

// ---- Opening ----

TEST_F(tables_with_files, are_read_again_once_their_last_handle_is_closed)
{
    const size_t             descriptors = open_descriptors();
    const rg_opaque_handle_t first       = open_table(tree, "m/t", RG_MODE_READ);
    EXPECT_EQ(open_table(tree, "m/t", RG_MODE_READ), first);
    EXPECT_EQ(object(first).references, 2u);
    add_elsewhere({2});
    ASSERT_EQ(rg_close_table_1(first), 0);
    EXPECT_EQ(values_of(first), (int64s{10})) << "the object lives while it is open";
    ASSERT_EQ(rg_close_table_1(first), 0);
    EXPECT_EQ(tree_object(tree).p_tables, nullptr);
    EXPECT_EQ(open_descriptors(), descriptors);
    EXPECT_EQ(values_of(open_table(tree, "m/t", RG_MODE_READ)), (int64s{10, 20}));
}

TEST_F(tables_with_files, that_have_no_file_dont_exist)
{
    rg_opaque_handle_t handle = nullptr;
    EXPECT_EQ(rg_open_table_1(tree, text("m/nothing"), RG_MODE_READ, &handle), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(
        rg_open_hashed_key_table_1(tree, text("m/nothing"), RG_MODE_WRITE, 16, hash_uint32, compare_uint32, &handle),
        RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(error_code(), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(handle, nullptr);
    EXPECT_EQ(tree_object(tree).p_tables, nullptr);
}

TEST_F(tables_with_files, opened_hashed_have_the_callers_hash_table)
{
    add_elsewhere({2, 3});
    rg_opaque_handle_t table = nullptr;
    ASSERT_EQ(open_hashed_code(tree, RG_MODE_READ, &table), 0);
    ASSERT_NE(object(table).p_rows_hash_table, nullptr);
    EXPECT_EQ(object(table).p_rows_hash_table->total_hash_buckets, 1024u);
    for (const kt_uint32_t id : {1u, 2u, 3u})
        EXPECT_EQ(value_by_key(table, id), id * 10);
    EXPECT_EQ(value_by_key(table, 4), -1);
}

TEST_F(tables_with_files, opened_with_a_hash_function_that_returns_no_bucket_are_refused)
{
    rg_opaque_handle_t table = nullptr;
    EXPECT_EQ(rg_open_hashed_key_table_1(
                  tree, text("m/t"), RG_MODE_READ, 4, [](void *) -> kt_uint32_t { return 4; }, compare_uint32, &table),
              RG_E_INTERNAL);
    EXPECT_EQ(error_code(), RG_E_INTERNAL);
    EXPECT_EQ(table, nullptr);
    EXPECT_EQ(tree_object(tree).p_tables, nullptr);
}

TEST_F(tables_with_files, whose_rows_share_a_checked_key_are_refused_without_a_record_when_opened_hashed)
{
    // A table without a hash table lets its key be set to one that another row has.
    rg_opaque_handle_t table = open_table(tree, "m/t", RG_MODE_WRITE);
    add(table, 2);
    kt_value_t one = uint32(1);
    ASSERT_EQ(rg_set_field_by_key_1(table, uint32(2), text("id"), &one), 0);
    ASSERT_EQ(rg_close_table_1(table), 0);

    const size_t       descriptors = open_descriptors();
    rg_opaque_handle_t hashed      = nullptr;
    ku_set_no_error_1();
    EXPECT_EQ(open_hashed_code(tree, RG_MODE_READ, &hashed), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(hashed, nullptr);
    EXPECT_EQ(open_descriptors(), descriptors);
    EXPECT_EQ(values_of(open_table(tree, "m/t", RG_MODE_READ)), (int64s{10, 20}));
}

TEST_F(tables_with_files, opened_without_memory_are_not_in_the_tree_and_hold_no_descriptor)
{
    const size_t       descriptors = open_descriptors();
    rg_opaque_handle_t table       = nullptr;
    fail_each_allocation([&] { return open_hashed_code(tree, RG_MODE_WRITE, &table); },
                         [&](kt_int32_t rc) {
                             EXPECT_EQ(tree_object(tree).p_tables != nullptr, rc == 0);
                             EXPECT_EQ(open_descriptors(), descriptors + (rc == 0 ? 1 : 0));
                         });
    EXPECT_EQ(value_by_key(table, 1), 10);
}

// ---- Upgrading ----

TEST_F(tables_with_files, open_for_reading_are_read_afresh_into_the_same_object_by_a_writer)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    add_elsewhere({2, 3});
    EXPECT_EQ(values_of(reader), (int64s{10}));
    EXPECT_EQ(add_row(reader, {{"id", uint32(9)}}), RG_E_ACCESS);

    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, explicit_write, &writer), 0);
    EXPECT_EQ(error_code(), 0) << "the mark of a file that was read doesn't reach the caller";
    EXPECT_EQ(writer, reader);
    EXPECT_EQ(object(reader).references, 2u);
    EXPECT_EQ(object(reader).implicitly_controlled, 0u);
    EXPECT_EQ(values_of(reader), (int64s{10, 20, 30})) << "existing handles see the new content";

    add(reader, 4);
    EXPECT_EQ(listed(&object(reader), 0), std::vector<kt_uint32_t>{3});
}

TEST_F(tables_with_files, upgraded_without_news_in_the_file_can_be_updated_committed_and_read_again)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    rg_opaque_handle_t       writer = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    add(writer, 2);
    add(reader, 3);
    ASSERT_EQ(rg_close_table_1(writer), 0);
    ASSERT_EQ(rg_close_table_1(reader), 0);
    EXPECT_EQ(values_of(open_table(tree, "m/t", RG_MODE_READ)), (int64s{10, 20, 30}));
}

TEST_F(tables_with_files, hold_the_files_lock_after_an_upgrade)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    EXPECT_FALSE(is_locked(file()));
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_TRUE(is_locked(file()));
    ASSERT_EQ(rg_close_table_1(writer), 0);
    EXPECT_TRUE(is_locked(file()));
    ASSERT_EQ(rg_close_table_1(reader), 0);
    EXPECT_FALSE(is_locked(file()));
}

TEST_F(tables_with_files, keep_in_an_upgrade_what_isnt_exchanged)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    rg_i_table_t &           table  = object(reader);
    rg_i_table_t             before;
    std::memcpy(static_cast<void *>(&before), &table, sizeof before);
    const size_t       descriptors = open_descriptors();
    rg_opaque_handle_t writer      = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_EQ(open_descriptors(), descriptors) << "the reader's descriptor went";

    EXPECT_EQ(table.p_name, before.p_name);
    EXPECT_EQ(table.p_file_path, before.p_file_path);
    EXPECT_EQ(table.p_rows_packed_index, before.p_rows_packed_index);
    EXPECT_EQ(table.p_application_metadata, before.p_application_metadata);
    EXPECT_EQ(table.disk_commit_record_offset, before.disk_commit_record_offset);
    EXPECT_EQ(table.disk_file_length, before.disk_file_length);
    EXPECT_EQ(table.p_rows_change_list, nullptr);
    EXPECT_EQ(table.p_delete_rows_change_list, nullptr);
    EXPECT_NE(table.p_rows_fixed_index, before.p_rows_fixed_index);
    EXPECT_NE(table.p_metadata_record_data, before.p_metadata_record_data);
    EXPECT_EQ(values_of(reader), (int64s{10}));
}

TEST_F(tables_with_files, are_written_after_an_upgrade_behind_the_commit_record_that_the_first_open_found)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    add_elsewhere({2, 3});
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    add(writer, 4);
    EXPECT_EQ(values_of(writer), (int64s{10, 20, 30, 40}));
    ASSERT_EQ(rg_close_table_1(writer), 0);
    ASSERT_EQ(rg_close_table_1(reader), 0);
    // What others committed in between is overwritten: the places in the file aren't among what is exchanged.
    EXPECT_EQ(values_of(open_table(tree, "m/t", RG_MODE_READ)), (int64s{10, 40}));
}

TEST_F(tables_with_files, show_after_an_upgrade_the_applications_data_of_the_first_open)
{
    const auto blob_of = [](rg_opaque_handle_t table) {
        kt_binary_t * p_binary = nullptr;
        EXPECT_EQ(rg_get_application_metadata_1(table, &p_binary), 0);
        const std::string result(reinterpret_cast<char *>(p_binary->data), p_binary->length);
        std::free(p_binary);
        return result;
    };
    const auto set_elsewhere = [&](char letter) {
        const rg_opaque_handle_t table = open_table(other, "m/t", RG_MODE_WRITE);
        kt_binary_t              binary{1, {static_cast<kt_uint8_t>(letter)}};
        ASSERT_EQ(rg_set_application_metadata_1(table, &binary), 0);
        ASSERT_EQ(rg_close_table_1(table), 0);
    };
    set_elsewhere('a');
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    set_elsewhere('b');
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_EQ(blob_of(reader), "a");
}

TEST_F(tables_with_files, lose_their_hash_table_in_an_upgrade_that_brings_none)
{
    rg_opaque_handle_t reader = nullptr;
    ASSERT_EQ(open_hashed_code(tree, RG_MODE_READ, &reader), 0);
    EXPECT_NE(object(reader).p_rows_hash_table, nullptr);
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_EQ(object(reader).p_rows_hash_table, nullptr);
    EXPECT_EQ(value_by_key(reader, 1), 10);
}

TEST_F(tables_with_files, get_the_hash_table_that_an_upgrade_brings)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    add_elsewhere({2});
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_hashed_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_EQ(writer, reader);
    ASSERT_NE(object(reader).p_rows_hash_table, nullptr);
    EXPECT_EQ(value_by_key(reader, 2), 20);
    add(reader, 3);
    EXPECT_EQ(value_by_key(reader, 3), 30);
}

TEST_F(tables_with_files, that_grew_much_are_addressed_rightly_after_an_upgrade)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    const kt_uint32_t        slots  = object(reader).maximum_rows;
    {
        const rg_opaque_handle_t table = open_table(other, "m/t", explicit_write);
        for (kt_uint32_t id = 2; id <= 500; ++id)
            add(table, id);
        ASSERT_EQ(rg_apply_1(table, 0), 0);
        ASSERT_EQ(rg_commit_1(table), 0);
        ASSERT_EQ(rg_close_table_1(table), 0);
    }
    rg_opaque_handle_t writer = nullptr;
    ASSERT_EQ(open_code(tree, explicit_write, &writer), 0);
    EXPECT_GT(object(reader).maximum_rows, slots);
    const std::vector<kt_int64_t> values = values_of(reader);
    ASSERT_EQ(values.size(), 500u);
    for (size_t row = 0; row < values.size(); ++row)
        EXPECT_EQ(values[row], static_cast<kt_int64_t>(row + 1) * 10);
}

TEST_F(tables_with_files, whose_upgrade_fails_stay_open_for_reading_with_a_reference_too_many)
{
    const rg_opaque_handle_t reader = open_table(tree, "m/t", RG_MODE_READ);
    const bytes              good   = read_file(file());
    write_file(file(), bytes(5, 0));
    rg_opaque_handle_t writer = nullptr;
    EXPECT_EQ(open_hashed_code(tree, RG_MODE_WRITE, &writer), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(writer, nullptr);
    EXPECT_EQ(object(reader).references, 2u);
    EXPECT_EQ(object(reader).mode, static_cast<kt_uint32_t>(RG_MODE_READ));
    EXPECT_EQ(values_of(reader), (int64s{10}));
    EXPECT_EQ(add_row(reader, {{"id", uint32(2)}}), RG_E_ACCESS);

    write_file(file(), good);
    ASSERT_EQ(open_code(tree, RG_MODE_WRITE, &writer), 0);
    EXPECT_EQ(object(reader).references, 3u);
    add(reader, 2);
    ASSERT_EQ(rg_close_table_1(reader), 0);
    ASSERT_EQ(rg_close_table_1(writer), 0);
    EXPECT_EQ(object(reader).references, 1u) << "so the tree keeps the table until it is closed itself";
    EXPECT_EQ(values_of(reader), (int64s{10, 20}));
}

TEST_F(tables_with_files, upgraded_without_memory_stay_as_they_were_for_readers)
{
    const rg_opaque_handle_t reader      = open_table(tree, "m/t", RG_MODE_READ);
    const size_t             descriptors = open_descriptors();
    kt_uint32_t              attempts    = 0;
    rg_opaque_handle_t       writer      = nullptr;
    // More rows than the packed index has room for, so that it has to grow.
    const rg_opaque_handle_t table = open_table(other, "m/t", explicit_write);
    for (kt_uint32_t id = 2; id <= 300; ++id)
        add(table, id);
    ASSERT_EQ(rg_apply_1(table, 0), 0);
    ASSERT_EQ(rg_commit_1(table), 0);
    ASSERT_EQ(rg_close_table_1(table), 0);

    fail_each_allocation([&] { return open_hashed_code(tree, RG_MODE_WRITE, &writer); },
                         [&](kt_int32_t rc) {
                             // The first one is for the hash table, ahead of the tree.
                             if (object(reader).references > 1)
                                 ++attempts;
                             EXPECT_EQ(object(reader).references, attempts + 1);
                             EXPECT_EQ(values_of(reader).size(), rc == 0 ? 300u : 1u);
                             EXPECT_LE(open_descriptors(), descriptors);
                         });
    EXPECT_EQ(writer, reader);
    EXPECT_EQ(value_by_key(reader, 300), 3000);
}

// ---- Names that meet ----

TEST(a_transient_table_named_like_a_file, is_what_an_open_under_the_mount_point_finds_and_upgrades_in_memory)
{
    char directory[] = "/tmp/ktrgXXXXXX"; // a path that a registry path can be, too
    ASSERT_NE(mkdtemp(directory), nullptr);
    {
        open_tree tree;
        tree.mount("m", directory);
        const std::string        name  = std::string(directory) + "/t";
        const rg_opaque_handle_t table = create_table(tree, name, columns(), RG_MODE_WRITE);
        kt_int32_t               rc    = 0;
        create_table(tree, "m/t", columns(), RG_MODE_WRITE, &rc);
        EXPECT_EQ(rc, RG_E_TABLE_EXISTS);
        ASSERT_EQ(rg_close_table_1(table), 0);
        ASSERT_EQ(open_table(tree, "m/t", RG_MODE_READ), table);

        const size_t descriptors = open_descriptors();
        ASSERT_EQ(open_table(tree, "m/t", RG_MODE_WRITE), table);
        add(table, 1);
        EXPECT_EQ(open_descriptors(), descriptors);
        EXPECT_FALSE(file_exists(name));
    }
    std::filesystem::remove_all(directory);
}

TEST_F(tables_with_files, of_one_name_close_as_the_very_objects_they_are)
{
    const rg_opaque_handle_t first = open_table(tree, "m/t", RG_MODE_READ);
    ASSERT_NE(tdelete(first, &tree_object(tree).p_tables, rg_i_table_compare), nullptr); // as a deletion does
    const rg_opaque_handle_t second = open_table(tree, "m/t", RG_MODE_READ);
    ASSERT_NE(first, second);
    EXPECT_EQ(rg_close_table_1(first), 0);
    EXPECT_EQ(open_table(tree, "m/t", RG_MODE_READ), second);
    EXPECT_EQ(values_of(second), (int64s{10}));
}
