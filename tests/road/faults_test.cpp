// SPDX-License-Identifier: MIT
// The main road from one end to the other with each allocation, and each system call, made to fail in turn. The call in
// which it happens gives a code with its record, or gets over it; the same call again goes through; and at the end the
// table holds what was committed, no more and no less.
#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <functional>

#include "support/faults.h"
#include "support/rows.h"

namespace kt_test
{

namespace
{

struct fault {
    call     which = call::count_; // count_: none
    unsigned nth   = 0;
    int      error = 0;
};

std::string name_of(const fault & f)
{
    return "call " + std::to_string(static_cast<int>(f.which)) + ", number " + std::to_string(f.nth) + ", errno " +
           std::to_string(f.error);
}

std::size_t open_descriptors()
{
    std::size_t count = 0;
    for ([[maybe_unused]] const auto & entry : std::filesystem::directory_iterator("/proc/self/fd"))
        ++count;
    return count;
}

// One walk along the road, with one fault somewhere on it.
class walk
{
  public:
    explicit walk(const fault & f) : fault_(f), descriptors_(open_descriptors())
    {
        if (f.which != call::count_)
            fail_call(f.which, f.nth, f.error);
    }

    ~walk()
    {
        EXPECT_EQ(open_descriptors(), descriptors_);
        reset_calls();
    }

    walk(const walk &)             = delete;
    walk & operator=(const walk &) = delete;

    [[nodiscard]] bool fault_happened() const { return fault_.which != call::count_ && failed_as_asked(fault_.which); }

    // Makes a call. If the fault hits it, its code and record are looked at, and it is made again.
    kt_int32_t make(const char * p_name, const std::function<kt_int32_t()> & the_call)
    {
        const kt_int32_t rc = the_call();
        if (rc == 0) {
            EXPECT_EQ(error_code(), 0) << p_name;
            return 0;
        }
        EXPECT_TRUE(fault_happened()) << p_name << " gave " << rc;
        EXPECT_EQ(error_code(), rc) << p_name;
        EXPECT_FALSE(error_text().empty()) << p_name;
        EXPECT_TRUE(code_fits(rc)) << p_name << " gave " << rc << ": " << error_text();
        const kt_int32_t again = the_call();
        // A creation that fails behind its last step leaves the file: then the table exists.
        if (again == RG_E_TABLE_EXISTS)
            return again;
        EXPECT_EQ(again, 0) << p_name << ", made again: " << error_text();
        return again;
    }

    // An update that isn't applied yet: a refused one changes nothing.
    void update(const char * p_name, rg_opaque_handle_t table, const std::function<kt_int32_t()> & the_call)
    {
        make(p_name, [&] {
            const table_picture before = picture_of(table);
            const kt_int32_t    rc     = the_call();
            if (rc != 0) {
                EXPECT_EQ(picture_of(table), before) << p_name;
            }
            return rc;
        });
    }

    // Applies and commits the updates, which are made again where a commit fails after a rewrite.
    void transaction(const char * p_name, rg_opaque_handle_t table, const std::function<void()> & updates)
    {
        updates();
        make(p_name, [&] { return rg_apply_1(table, 0); });
        const kt_int32_t rc = rg_commit_1(table);
        if (rc != 0) {
            EXPECT_TRUE(fault_happened()) << p_name << ": commit gave " << rc;
            EXPECT_EQ(error_code(), rc) << p_name;
            EXPECT_TRUE(code_fits(rc)) << p_name << ": commit gave " << rc << ": " << error_text();
        }
        if (object_of(table).ready_for_commit == 2) {
            // The rewrite file is gone: the only way on is an abort.
            EXPECT_NE(rg_commit_1(table), 0) << p_name;
            EXPECT_EQ(rg_abort_1(table), 0) << p_name;
            updates();
            EXPECT_EQ(rg_apply_1(table, 0), 0) << p_name;
        }
        // A sync that fails leaves the table applied, with a code or, where the word could be restored, without one.
        if (object_of(table).ready_for_commit != 0) {
            EXPECT_EQ(rg_commit_1(table), 0) << p_name;
        }
        EXPECT_EQ(object_of(table).ready_for_commit, 0u) << p_name;
    }

    rg_opaque_handle_t open_tree_on(const std::string & directory)
    {
        rg_opaque_handle_t tree = nullptr;
        make("open tree", [&] { return rg_open_tree_1(&tree, 0, 0); });
        make("mount", [&] { return rg_mount_local_tree_1(tree, text("/m"), text(directory), 1); });
        return tree;
    }

    rg_opaque_handle_t create_or_open(rg_opaque_handle_t tree, std::vector<rg_column_t> columns, kt_int32_t mode)
    {
        rg_opaque_handle_t table = nullptr;
        const kt_int32_t   rc    = make("create", [&] {
            std::vector<rg_column_t> fresh = columns; // defaults are overwritten by a creation
            return rg_create_hashed_key_table_1(tree, text("/m/table"), fresh.data(),
                                                     static_cast<kt_uint32_t>(fresh.size()), mode, 1024, hash_uint32,
                                                     compare_uint32, &table);
        });
        return rc == RG_E_TABLE_EXISTS ? open(tree, mode) : table;
    }

    rg_opaque_handle_t open(rg_opaque_handle_t tree, kt_int32_t mode)
    {
        rg_opaque_handle_t table = nullptr;
        make("open", [&] {
            return rg_open_hashed_key_table_1(tree, text("/m/table"), mode, 1024, hash_uint32, compare_uint32, &table);
        });
        return table;
    }

    void close(rg_opaque_handle_t tree, rg_opaque_handle_t table)
    {
        make("close table", [&] { return rg_close_table_1(table); });
        make("close tree", [&] { return rg_close_tree_1(tree); });
    }

    std::string read_string(rg_opaque_handle_t table, kt_uint32_t id, const char * p_column)
    {
        kt_value_t value{};
        make("read", [&] { return rg_get_field_by_key_1(table, uint32(id), text(p_column), &value); });
        std::string result = value.ptr_char != nullptr ? value.ptr_char : "";
        std::free(value.ptr_char);
        return result;
    }

  private:
    // The codes that a fault of this kind may have.
    [[nodiscard]] bool code_fits(kt_int32_t rc) const
    {
        if (fault_.which == call::allocation)
            return rc == RG_E_NO_MEMORY || rc == RG_E_LIBRARY_CALL;
        if (fault_.which == call::stat)
            return rc == RG_E_TABLE_EXISTS; // a creation takes any failure but ENOENT for a table
        if (fault_.error == ENOSPC)
            return rc == RG_E_FILESYSTEM_FULL_DETAIL || rc == RG_E_SYSTEM_CALL;
        if (fault_.error == EACCES)
            return rc == RG_E_ACCESS || rc == RG_E_SYSTEM_CALL || rc == RG_E_TABLE_EXISTS; // lockf's EACCES is a rival
        return rc == RG_E_SYSTEM_CALL;
    }

    const fault       fault_;
    const std::size_t descriptors_;
};

constexpr kt_int32_t writing = RG_MODE_READ | RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL;

std::vector<rg_column_t> columns_of_the_road()
{
    return {column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("nobody")),
            column("n", KT_INT64, RG_STANDARD, int64(-1))};
}

// The names of a row's columns and room for its values, made ahead of the calls: what a test allocates counts too.
struct row_arguments {
    row_arguments(kt_uint32_t id, const std::string & name) : values{uint32(id), string(name)} {}
    kt_int32_t add_to(rg_opaque_handle_t table) { return rg_add_row_1(table, names, pointers, 2); }
    kt_int32_t set_name_in(rg_opaque_handle_t table)
    {
        return rg_set_field_by_key_1(table, values[0], names[1], &values[1]);
    }

    kt_char_ptr_t names[2]{text("id"), text("name")};
    kt_value_t    values[2];
    kt_value_t *  pointers[2]{&values[0], &values[1]};
};

kt_binary_t * blob_of(const char * p_text)
{
    static char  room[64];
    auto * const p_binary = reinterpret_cast<kt_binary_t *>(room);
    p_binary->length      = static_cast<kt_uint32_t>(std::strlen(p_text));
    std::memcpy(room + offsetof(kt_binary_t, data), p_text, p_binary->length);
    return p_binary;
}

// What the road leaves: rows 1, 3 and 9, and the blob.
void look_at_the_end(const std::string & directory)
{
    open_tree                tree;
    const rg_opaque_handle_t table = [&] {
        tree.mount("/m", directory);
        return open_table(tree, "/m/table", RG_MODE_READ);
    }();
    ASSERT_NE(table, nullptr);
    EXPECT_EQ(object_of(table).total_committed_rows, 3u);
    EXPECT_EQ(taken_string(read_key(table, uint32(1), "name")), "one, renamed twice");
    EXPECT_EQ(taken_string(read_key(table, uint32(3), "name")), "nobody");
    EXPECT_EQ(read_key(table, uint32(3), "n").value.val_int64, -1);
    EXPECT_EQ(taken_string(read_key(table, uint32(9), "name")), std::string(5000, '9'));
    EXPECT_EQ(read_key(table, uint32(2), "n").rc, RG_E_NO_SUCH_KEY);
    EXPECT_EQ(read_key(table, uint32(7), "n").rc, RG_E_NO_SUCH_KEY);
    kt_binary_t * p_blob = nullptr;
    ASSERT_EQ(rg_get_application_metadata_1(table, &p_blob), 0);
    EXPECT_EQ(p_blob->length, 8u);
    EXPECT_EQ(std::memcmp(p_blob->data, "the blob", 8), 0);
    std::free(p_blob);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

// The road under explicit control. Returns whether the fault happened on it.
bool walk_the_road(const fault & f)
{
    SCOPED_TRACE(name_of(f));
    const temp_dir directory;
    row_arguments  one(1, "one"), two(2, "two"), seven(7, "aborted"), renamed(1, "one, renamed"),
        renamed_twice(1, "one, renamed twice"), nine(9, std::string(5000, '9'));
    std::vector<row_arguments> large;
    for (kt_uint32_t id = 20; id < 24; ++id)
        large.emplace_back(id, std::string(5000, 'x'));
    for (row_arguments & row : large)
        row.pointers[0] = &row.values[0], row.pointers[1] = &row.values[1];
    kt_char_ptr_t just_id[]{text("id")};
    kt_value_t    three = uint32(3);
    kt_value_t *  p_three[]{&three};

    bool happened = false;
    {
        walk w(f);
        // Made here.
        rg_opaque_handle_t tree  = w.open_tree_on(directory.path());
        rg_opaque_handle_t table = w.create_or_open(tree, columns_of_the_road(), writing);
        if (table == nullptr)
            return true;
        w.transaction("first rows", table, [&] {
            w.update("add 1", table, [&] { return one.add_to(table); });
            w.update("add 2", table, [&] { return two.add_to(table); });
            w.update("add 3", table, [&] { return rg_add_row_1(table, just_id, p_three, 1); });
        });
        EXPECT_EQ(w.read_string(table, 1, "name"), "one");
        w.update("add 7", table, [&] { return seven.add_to(table); });
        w.make("abort", [&] { return rg_abort_1(table); });
        w.transaction("update, deletion and blob", table, [&] {
            w.update("set 1", table, [&] { return renamed.set_name_in(table); });
            w.update("delete 2", table, [&] { return rg_delete_row_by_index_1(table, 1); });
            w.make("blob", [&] { return rg_set_application_metadata_1(table, blob_of("the blob")); });
        });
        w.close(tree, table);

        // Opened again, aborted after an apply, and made large.
        tree  = w.open_tree_on(directory.path());
        table = w.open(tree, writing);
        if (table == nullptr)
            return true;
        EXPECT_EQ(w.read_string(table, 1, "name"), "one, renamed");
        w.update("add 7", table, [&] { return seven.add_to(table); });
        w.make("apply", [&] { return rg_apply_1(table, 0); });
        w.make("abort", [&] { return rg_abort_1(table); });
        w.transaction("large rows", table, [&] {
            for (row_arguments & row : large)
                w.update("add a large row", table, [&] { return row.add_to(table); });
            w.update("add 9", table, [&] { return nine.add_to(table); });
        });
        w.transaction("deletions", table, [&] {
            for (kt_uint32_t packed = 0; packed < object_of(table).total_applied_rows; ++packed) {
                const kt_uint32_t id = read_packed(table, packed, "id").value.val_uint32;
                if (id >= 20)
                    w.update("delete a large row", table, [&] { return rg_delete_row_by_index_1(table, packed); });
            }
        });
        w.close(tree, table);

        // Opened once more: mostly dead, so that the next transaction writes it anew.
        tree  = w.open_tree_on(directory.path());
        table = w.open(tree, writing);
        if (table == nullptr)
            return true;
        EXPECT_NE(rg_i_rewrite_is_due(&object_of(table)), 0u);
        w.transaction("rewrite", table,
                      [&] { w.update("set 1", table, [&] { return renamed_twice.set_name_in(table); }); });
        EXPECT_LT(object_of(table).file_length, 6000u);
        EXPECT_EQ(w.read_string(table, 1, "name"), "one, renamed twice");
        w.close(tree, table);
        happened = w.fault_happened();
    }
    look_at_the_end(directory.path());
    return happened;
}

// The road under implicit control, where each update is a transaction.
bool walk_the_implicit_road(const fault & f)
{
    SCOPED_TRACE(name_of(f));
    const temp_dir directory;
    row_arguments  one(1, "one"), two(2, "two"), renamed(1, "one, renamed twice"), nine(9, std::string(5000, '9'));
    kt_char_ptr_t  just_id[]{text("id")};
    kt_value_t     three = uint32(3);
    kt_value_t *   p_three[]{&three};

    bool happened = false;
    {
        walk               w(f);
        rg_opaque_handle_t tree  = w.open_tree_on(directory.path());
        rg_opaque_handle_t table = w.create_or_open(tree, columns_of_the_road(), RG_MODE_READ | RG_MODE_WRITE);
        if (table == nullptr)
            return true;
        const auto update = [&](const char * p_name, const std::function<kt_int32_t()> & the_call) {
            const kt_int32_t rc = the_call();
            EXPECT_EQ(error_code(), rc) << p_name;
            EXPECT_TRUE(rc == 0 || w.fault_happened()) << p_name << " gave " << rc;
            if (object_of(table).ready_for_commit != 0) {
                EXPECT_EQ(rg_commit_1(table), 0) << p_name << ": only its commit was missing";
            } else if (rc != 0) {
                EXPECT_EQ(picture_of(table).updated.size() + picture_of(table).deleted.size(), 0u)
                    << p_name << ": taken back";
                EXPECT_EQ(the_call(), 0) << p_name << ", made again: " << error_text();
            }
        };
        update("add 1", [&] { return one.add_to(table); });
        update("add 2", [&] { return two.add_to(table); });
        update("add 3", [&] { return rg_add_row_1(table, just_id, p_three, 1); });
        update("blob", [&] { return rg_set_application_metadata_1(table, blob_of("the blob")); });
        update("set 1", [&] { return renamed.set_name_in(table); });
        update("delete 2", [&] { return rg_delete_row_by_index_1(table, 1); });
        update("add 9", [&] { return nine.add_to(table); });
        w.close(tree, table);
        happened = w.fault_happened();
    }
    look_at_the_end(directory.path());
    return happened;
}

// Walks with the first call of the kind failing, then the second, until none is left. Returns how many there were.
unsigned walk_with_each(bool (*p_walk)(const fault &), call which, int error)
{
    for (unsigned nth = 1;; ++nth)
        if (!p_walk({which, nth, error}) || ::testing::Test::HasFailure())
            return nth - 1;
}

TEST(the_main_road, leads_to_its_end)
{
    EXPECT_FALSE(walk_the_road({}));
    EXPECT_FALSE(walk_the_implicit_road({}));
}

TEST(the_main_road, gets_over_each_allocation_that_fails)
{
    EXPECT_GT(walk_with_each(walk_the_road, call::allocation, ENOMEM), 100u);
    EXPECT_GT(walk_with_each(walk_the_implicit_road, call::allocation, ENOMEM), 40u);
}

struct the_main_road_with_faults : ::testing::TestWithParam<int> {
};
INSTANTIATE_TEST_SUITE_P(errnos, the_main_road_with_faults, ::testing::Values(EIO, ENOSPC, EACCES),
                         [](const auto & info) {
                             return std::string(info.param == EIO ? "EIO" : info.param == ENOSPC ? "ENOSPC" : "EACCES");
                         });

TEST_P(the_main_road_with_faults, gets_over_each_system_call_that_fails)
{
    // At least as many of each as the road is known to make.
    const std::pair<call, unsigned> calls[]{{call::open, 4},   {call::read, 2},   {call::write, 4},
                                            {call::writev, 5}, {call::fsync, 10}, {call::lseek, 8},
                                            {call::rename, 2}, {call::lockf, 4},  {call::stat, 2},
                                            {call::mkdir, 3},  {call::unlink, 0}, {call::ftruncate, 1}};
    for (const auto & [which, at_least] : calls) {
        EXPECT_GE(walk_with_each(walk_the_road, which, GetParam()), at_least) << static_cast<int>(which);
        walk_with_each(walk_the_implicit_road, which, GetParam());
    }
}

TEST(the_main_road, takes_interrupted_calls_again)
{
    for (const call which : {call::write, call::writev, call::fsync})
        for (unsigned nth = 1; nth < 50; ++nth) {
            const fault f{which, nth, EINTR};
            SCOPED_TRACE(name_of(f));
            if (!walk_the_implicit_road(f))
                break;
        }
}

TEST(the_main_road, makes_two_syncs_and_writes_at_most_sixteen_elements_for_each_implicit_update)
{
    const temp_dir directory;
    open_tree      tree;
    tree.mount("/m", directory.path());
    const rg_opaque_handle_t table =
        create_hashed_table(tree, "/m/table", columns_of_the_road(), RG_MODE_READ | RG_MODE_WRITE);
    row_arguments     one(1, "one"), renamed(1, "two");
    const fault_scope faults;
    ASSERT_EQ(one.add_to(table), 0);
    EXPECT_EQ(calls_made(call::fsync), 2u);
    ASSERT_EQ(renamed.set_name_in(table), 0);
    EXPECT_EQ(calls_made(call::fsync), 4u);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    EXPECT_EQ(calls_made(call::fsync), 6u);
    EXPECT_LE(longest_writev(), 16);
}

} // namespace

} // namespace kt_test
