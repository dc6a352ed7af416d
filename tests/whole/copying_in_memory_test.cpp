// SPDX-License-Identifier: MIT
// Copies and moves to memory: what a copy shares with its source and what not, and that it stays good whatever becomes
// of the source.
#include "whole/places.h"

namespace kt_test
{

namespace
{

// Names long enough to be told from freed memory, a default string, and a definition of structured data.
std::vector<rg_column_t> named_columns()
{
    static kt_uint8_t storage[sizeof(rg_sd_def_t) + sizeof(rg_field_def_t)];
    auto *            p_definition = reinterpret_cast<rg_sd_def_t *>(storage);
    rg_field_def_t    fields[2]    = {{KT_INT32, text("first")}, {KT_CHAR_PTR, text("second")}};
    p_definition->number_of_fields = 2;
    std::memcpy(static_cast<void *>(p_definition->fields), fields, sizeof fields);
    rg_column_t structured = column("structured_column", KT_SD_PTR, RG_STANDARD, null_value());
    structured.sd_defn     = p_definition;
    return {column("the_name_of_the_key", KT_CHAR_PTR, RG_PRIMARY_KEY, string("")),
            column("another_column", KT_CHAR_PTR, RG_STANDARD, string("the default")), structured};
}

kt_int32_t add_named(rg_opaque_handle_t table, const std::string & key)
{
    return add_row(table, {{"the_name_of_the_key", string(key)}});
}

std::string other_of(rg_opaque_handle_t table, const std::string & key)
{
    return taken_string(read_key(table, string(key), "another_column"));
}

// Whether everything that needs names, defaults and definitions works on the table.
void use_names(places & p, rg_opaque_handle_t table, const std::string & new_key)
{
    EXPECT_EQ(add_named(table, new_key), 0);
    EXPECT_EQ(other_of(table, new_key), "the default");
    EXPECT_EQ(set_fields_by_key(table, string(new_key), {{"another_column", string("set")}}), 0);
    EXPECT_EQ(other_of(table, new_key), "set");
    void *      p_buffer = nullptr;
    kt_uint32_t none     = 0;
    kt_uint32_t visible  = 0;
    EXPECT_EQ(rg_pack_tables_1(1, &table, &visible, &none, nullptr, &p_buffer), 0) << error_text();
    std::free(p_buffer);
    EXPECT_EQ(copy_by_handle(table, "/r/written", 1), 0);
    rg_opaque_handle_t written = open_table(p.tree, "/r/written", RG_MODE_READ);
    ASSERT_NE(written, nullptr);
    EXPECT_EQ(other_of(written, new_key), "set");
    EXPECT_EQ(rg_close_table_1(written), 0);
}

} // namespace

TEST(a_copy_in_memory, keeps_row_indices_free_slots_and_the_counter)
{
    for (const bool hashed : {false, true}) {
        places             p;
        rg_opaque_handle_t source = p.create("/t", {}, explicit_writing, hashed);
        for (std::uint32_t id = 0; id < 150; ++id) // the index grows on the way
            ASSERT_EQ(add(source, id, id), 0);
        ASSERT_EQ(commit(source), 0);
        for (const std::uint32_t id : {3u, 70u, 149u})
            ASSERT_EQ(remove(source, id), 0);
        ASSERT_EQ(commit(source), 0);
        ASSERT_EQ(copy_by_handle(source, "/copy"), 0);
        rg_opaque_handle_t copy = open_table(p.tree, "/copy", explicit_writing);
        EXPECT_EQ(object(copy).references, 1u);
        EXPECT_EQ(object(copy).change_counter, object(source).change_counter);
        EXPECT_EQ(object(copy).implicitly_controlled, 0u);
        for (const std::uint32_t id : {0u, 69u, 148u})
            EXPECT_EQ(find_key(copy, uint32(id)), id);
        EXPECT_EQ(find_key(copy, uint32(70)), -RG_E_NO_SUCH_KEY);
        for (const std::uint32_t slot : {3u, 70u, 149u}) {
            EXPECT_EQ(rg_i_fixed_row_index(&object(copy), object(copy).p_rows_free_chain), slot);
            if (hashed || slot == 149) {
                ASSERT_EQ(add(copy, 1000 + slot, 0), 0) << "the lowest free slot is used next";
                EXPECT_EQ(find_key(copy, uint32(1000 + slot)), slot);
            } else {
                rg_i_rows_free_chain_remove(&object(copy));
            }
        }
        EXPECT_EQ(rg_close_table_1(copy), 0);
        EXPECT_EQ(rg_close_table_1(source), 0);
    }
}

TEST(a_copy_in_memory, starts_without_references_and_is_not_read_only_for_its_source)
{
    places p;
    p.create_and_close("/t", {{1, 10}});
    ASSERT_EQ(copy_by_name(p.tree, "/t", "/copy"), 0);
    rg_opaque_handle_t copy = open_table(p.tree, "/copy", explicit_writing);
    EXPECT_EQ(object(copy).references, 1u);
    EXPECT_EQ(object(copy).implicitly_controlled, 0u) << "the first opener decides";
    EXPECT_EQ(rg_close_table_1(copy), 0);
    EXPECT_EQ(rg_delete_table_1(p.tree, text("/copy")), 0);
}

TEST(a_copy_in_memory, is_refused_with_anything_pending_or_applied_but_a_move_takes_the_table_as_it_is)
{
    for (const char * path : {"/t", "/r/t"})
        for (const char * state : {"updated", "deleted", "applied"}) {
            places             p;
            rg_opaque_handle_t table = p.create(path, {{1, 10}, {2, 20}}, explicit_writing);
            if (state == std::string("deleted")) {
                ASSERT_EQ(remove(table, 1), 0);
            } else {
                ASSERT_EQ(set(table, 1, 11), 0);
            }
            if (state == std::string("applied")) {
                ASSERT_EQ(rg_apply_1(table, 0), 0);
            }
            EXPECT_EQ(copy_by_handle(table, "/copy"), RG_E_UNCOMMITTED_TABLE) << path << state;
            EXPECT_EQ(error_code(), RG_E_UNCOMMITTED_TABLE);
            EXPECT_EQ(p.code_at("/copy"), RG_E_NO_SUCH_TABLE);

            EXPECT_EQ(move_by_handle(table, "/moved"), 0);
            EXPECT_EQ(open_table(p.tree, "/moved", explicit_writing), table);
            EXPECT_EQ(rg_close_table_1(table), 0);
            EXPECT_EQ(rg_abort_1(table), 0);
            EXPECT_EQ(rows_by_id(table), (rows{{1, 10}, {2, 20}}));
            EXPECT_EQ(rg_close_table_1(table), 0);
        }
}

// ---- Lifetime ----

TEST(a_copy_in_memory, stays_good_when_its_source_is_deleted_and_closed)
{
    for (const bool hashed : {false, true})
        for (const char * path : {"/t", "/r/t"}) {
            places             p;
            rg_opaque_handle_t source = hashed ? create_hashed_table(p.tree, path, named_columns(), RG_MODE_WRITE)
                                               : create_table(p.tree, path, named_columns(), RG_MODE_WRITE);
            ASSERT_EQ(add_named(source, "one"), 0);
            ASSERT_EQ(copy_by_handle(source, "/copy"), 0);
            rg_opaque_handle_t copy = open_table(p.tree, "/copy", RG_MODE_WRITE);
            EXPECT_EQ(+object(copy).p_columns[0].name, +object(source).p_columns[0].name)
                << "names stay where the source has them";
            EXPECT_EQ(+object(copy).p_columns[2].sd_defn, +object(source).p_columns[2].sd_defn);
            ASSERT_EQ(rg_delete_table_1(p.tree, text(path)), 0);
            ASSERT_EQ(rg_close_table_1(source), 0);
            EXPECT_EQ(other_of(copy, "one"), "the default");
            use_names(p, copy, "two");
            EXPECT_EQ(rg_close_table_1(copy), 0);
        }
}

TEST(a_copy_in_memory, of_a_copy_of_a_copy_stays_good_when_all_the_others_are_gone)
{
    places             p;
    rg_opaque_handle_t source = create_hashed_table(p.tree, "/t0", named_columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_named(source, "one"), 0);
    ASSERT_EQ(rg_close_table_1(source), 0);
    for (int i = 0; i < 3; ++i) {
        ASSERT_EQ(copy_by_name(p.tree, "/t" + std::to_string(i), "/t" + std::to_string(i + 1)), 0);
        ASSERT_EQ(rg_delete_table_1(p.tree, text("/t" + std::to_string(i))), 0);
    }
    rg_opaque_handle_t copy = open_table(p.tree, "/t3", RG_MODE_WRITE);
    ASSERT_NE(copy, nullptr);
    EXPECT_EQ(other_of(copy, "one"), "the default");
    use_names(p, copy, "two");
    EXPECT_EQ(rg_close_table_1(copy), 0);
}

TEST(a_copy_in_memory, may_take_the_place_of_its_own_source)
{
    places             p;
    rg_opaque_handle_t source = create_hashed_table(p.tree, "/t", named_columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_named(source, "one"), 0);
    ASSERT_EQ(rg_close_table_1(source), 0);
    for (int i = 0; i < 3; ++i) {
        ASSERT_EQ(copy_by_name(p.tree, "/t", "/copy", 1), 0);
        ASSERT_EQ(move_by_name(p.tree, "/copy", "/t", 1), 0);
    }
    rg_opaque_handle_t table = open_table(p.tree, "/t", RG_MODE_WRITE);
    EXPECT_EQ(other_of(table, "one"), "the default");
    use_names(p, table, "two");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_copy_in_memory, finds_its_keys_whatever_its_source_does_to_its_rows)
{
    places             p;
    rg_opaque_handle_t source = create_hashed_table(p.tree, "/t", named_columns(), RG_MODE_WRITE);
    for (int i = 0; i < 50; ++i)
        ASSERT_EQ(add_named(source, "key " + std::to_string(i)), 0);
    ASSERT_EQ(copy_by_handle(source, "/copy"), 0);
    while (object(source).total_applied_rows > 0)
        ASSERT_EQ(rg_delete_row_by_index_1(source, 0), 0);
    for (int i = 0; i < 50; ++i)
        ASSERT_EQ(add_named(source, std::string(200, 'x') + std::to_string(i)), 0);
    rg_opaque_handle_t copy = open_table(p.tree, "/copy", RG_MODE_WRITE);
    for (int i = 0; i < 50; ++i)
        EXPECT_EQ(other_of(copy, "key " + std::to_string(i)), "the default") << i;
    EXPECT_EQ(add_named(copy, "key 7"), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(rg_close_table_1(copy), 0);
    EXPECT_EQ(rg_close_table_1(source), 0);
}

TEST(a_copy_in_memory, stays_good_when_the_contents_of_its_source_are_exchanged)
{
    places             p;
    rg_opaque_handle_t source = create_table(p.tree, "/r/t", named_columns(), RG_MODE_WRITE);
    ASSERT_EQ(add_named(source, "one"), 0);
    ASSERT_EQ(copy_by_handle(source, "/copy"), 0);
    ASSERT_EQ(copy_by_handle(source, "/r/t", 1), 0); // which reads the file into it afresh
    rg_opaque_handle_t copy = open_table(p.tree, "/copy", RG_MODE_WRITE);
    EXPECT_NE(+object(copy).p_columns[0].name, +object(source).p_columns[0].name);
    EXPECT_EQ(rg_close_table_1(source), 0);
    EXPECT_EQ(other_of(copy, "one"), "the default");
    use_names(p, copy, "two");
    EXPECT_EQ(rg_close_table_1(copy), 0);
}

TEST(a_copy_in_memory, writes_the_file_that_its_source_writes)
{
    places             p;
    rg_opaque_handle_t source = create_table(p.tree, "/t", named_columns(), RG_MODE_WRITE);
    for (int i = 0; i < 20; ++i)
        ASSERT_EQ(add_named(source, "key " + std::to_string(i)), 0);
    ASSERT_EQ(copy_by_handle(source, "/copy"), 0);
    ASSERT_EQ(copy_by_name(p.tree, "/copy", "/copy2"), 0);
    ASSERT_EQ(copy_by_handle(source, "/r/a"), 0);
    ASSERT_EQ(rg_close_table_1(source), 0);
    ASSERT_EQ(rg_delete_table_1(p.tree, text("/t")), 0);
    ASSERT_EQ(copy_by_name(p.tree, "/copy", "/r/b"), 0);
    ASSERT_EQ(copy_by_name(p.tree, "/copy2", "/r/c"), 0);
    EXPECT_EQ(to_hex(read_file(p.dir.file("b"))), to_hex(read_file(p.dir.file("a"))));
    EXPECT_EQ(to_hex(read_file(p.dir.file("c"))), to_hex(read_file(p.dir.file("a"))));
}

// ---- Tables that are odd ----

TEST(a_copy_of_packed_rows, has_none_of_them_and_keeps_the_counts)
{
    for (const kt_uint32_t buckets : {0u, 1024u}) {
        places             p;
        rg_opaque_handle_t sender   = p.create("/t", {{1, 10}, {2, 20}});
        void *             p_buffer = nullptr;
        kt_uint32_t        none     = 0;
        kt_uint32_t        visible  = 0;
        ASSERT_EQ(rg_pack_tables_1(1, &sender, &visible, &none, nullptr, &p_buffer), 0);
        open_tree          receiver;
        rg_opaque_handle_t packed = nullptr;
        ASSERT_EQ(rg_unpack_table_1(p_buffer, buckets, hash_uint32, compare_uint32, receiver, 0, &packed), 0);
        std::free(p_buffer);
        ASSERT_EQ(copy_by_handle(packed, "/copy"), 0);
        ASSERT_EQ(rg_delete_table_1(receiver, text("/t")), 0);
        ASSERT_EQ(rg_close_table_1(packed), 0);

        ASSERT_EQ(copy_by_name(receiver, "/copy", "/copy2"), 0);
        for (const char * path : {"/copy", "/copy2"}) {
            rg_opaque_handle_t copy = open_table(receiver, path, RG_MODE_WRITE);
            ASSERT_NE(copy, nullptr);
            EXPECT_EQ(object(copy).total_applied_rows, 2u);
            EXPECT_EQ(object(copy).total_committed_rows, 2u);
            for (kt_uint32_t row = 0; row < 2; ++row) {
                EXPECT_EQ(state_of(copy, row), static_cast<rg_row_state_t>(RG_ROW_STATE_NO_ROW));
                EXPECT_EQ(read_packed(copy, row, "val").rc, RG_E_ROW_DELETED);
                EXPECT_EQ(rg_delete_row_by_index_1(copy, row), RG_E_ROW_DELETED);
            }
            EXPECT_NE(read_key(copy, uint32(1), "val").rc, 0);
            if (buckets != 0) {
                EXPECT_EQ(add(copy, 1, 11), 0);
                EXPECT_EQ(add(copy, 5, 50), 0);
                EXPECT_EQ(read_key(copy, uint32(5), "val").value.val_int64, 50);
            } else {
                // The search for an equal key goes on until it has seen as many rows as are counted, and meets the new
                // one.
                EXPECT_EQ(add(copy, 5, 50), RG_E_DUPLICATE_KEY);
            }
            EXPECT_EQ(rg_close_table_1(copy), 0);
        }
        EXPECT_EQ(rg_close_table_1(sender), 0);
    }
}

TEST(a_copy_of_a_hashed_table, with_two_rows_of_one_key_is_refused_without_an_error_record)
{
    places             p;
    rg_opaque_handle_t source = p.create("/t", {{1, 10}, {2, 20}}, RG_MODE_WRITE, true);
    ASSERT_EQ(set_fields_by_key(source, uint32(2), {{"id", uint32(1)}}), 0);
    ku_set_no_error_1();
    EXPECT_EQ(copy_by_handle(source, "/copy"), RG_E_DUPLICATE_KEY);
    EXPECT_EQ(error_code(), 0);
    EXPECT_EQ(p.code_at("/copy"), RG_E_NO_SUCH_TABLE);
    EXPECT_EQ(rg_close_table_1(source), 0);
}

// ---- From a file ----

TEST(a_file_read_into_memory, is_open_for_writing_under_implicit_control_with_one_reference)
{
    places p;
    ASSERT_EQ(rg_close_table_1(p.create("/r/t", {{1, 10}, {2, 20}}, explicit_writing)), 0);
    const size_t before = open_descriptors();
    ASSERT_EQ(copy_by_name(p.tree, "/r/t", "/copy"), 0);
    EXPECT_EQ(open_descriptors(), before);
    kt_int32_t rc = 0;
    EXPECT_EQ(open_table(p.tree, "/copy", explicit_writing, &rc), nullptr);
    EXPECT_EQ(rc, RG_E_EXCLUSIVE_OPEN) << "its reference counts like an opener's";
    rg_opaque_handle_t copy = open_table(p.tree, "/copy", RG_MODE_READ);
    EXPECT_EQ(object(copy).references, 2u);
    EXPECT_EQ(object(copy).implicitly_controlled, 1u);
    EXPECT_EQ(object(copy).mode, 2u);
    EXPECT_EQ(object(copy).block_size, 0u);
    EXPECT_EQ(object(copy).p_file_path, nullptr);
    EXPECT_EQ(object(copy).p_persistent_table_registry_path, nullptr);
    EXPECT_STREQ(object(copy).p_name, "/copy");
    EXPECT_EQ(add(copy, 3, 30), 0);
    EXPECT_EQ(rg_close_table_1(copy), 0);
    EXPECT_EQ(p.rows_at("/copy"), (rows{{1, 10}, {2, 20}, {3, 30}})) << "it waits in the tree";
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{1, 10}, {2, 20}}));
}

TEST(a_file_read_into_memory, can_be_deleted_open_or_not_without_a_trace)
{
    places p;
    p.create_and_close("/r/t", {{1, 10}});
    ASSERT_EQ(copy_by_name(p.tree, "/r/t", "/a"), 0);
    EXPECT_EQ(rg_delete_table_1(p.tree, text("/a")), 0);
    ASSERT_EQ(copy_by_name(p.tree, "/r/t", "/b"), 0);
    rg_opaque_handle_t table = open_table(p.tree, "/b", RG_MODE_WRITE);
    EXPECT_EQ(rg_delete_table_1(p.tree, text("/b")), 0);
    EXPECT_EQ(add(table, 2, 20), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    ASSERT_EQ(copy_by_name(p.tree, "/r/t", "/c"), 0);
    EXPECT_EQ(move_by_name(p.tree, "/c", "/r/moved"), 0);
    EXPECT_EQ(p.rows_at("/r/moved"), (rows{{1, 10}}));
}

TEST(a_file_read_into_memory, keeps_the_rewrite_file_of_a_moved_source_for_a_repair)
{
    places p;
    p.create_and_close("/r/t", {{1, 10}});
    write_file(p.dir.file("t.rewrite"), {1});
    EXPECT_EQ(move_by_name(p.tree, "/r/t", "/moved"), 0);
    EXPECT_FALSE(file_exists(p.dir.file("t")));
    EXPECT_TRUE(file_exists(p.dir.file("t.rewrite")));
    EXPECT_EQ(p.rows_at("/moved"), (rows{{1, 10}}));
}

TEST(a_file_read_into_memory, that_is_damaged_is_refused_and_stays)
{
    places p;
    write_file(p.dir.file("t"), bytes(40, 0));
    EXPECT_EQ(move_by_name(p.tree, "/r/t", "/moved"), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
    EXPECT_TRUE(file_exists(p.dir.file("t")));
    EXPECT_EQ(p.code_at("/moved"), RG_E_NO_SUCH_TABLE);
}

// ---- Moves ----

TEST(a_move_in_memory, of_a_table_with_a_file_removes_the_file_and_keeps_the_file_fields)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}});
    EXPECT_EQ(move_by_handle(table, "/moved"), 0);
    EXPECT_FALSE(file_exists(p.dir.file("t")));
    EXPECT_NE(object(table).p_file_path, nullptr);
    EXPECT_GE(object(table).file_fd, 0);
    EXPECT_EQ(object(table).block_size, 512u);
    EXPECT_EQ(add(table, 2, 20), 0) << "it goes on with the file that it has open";
    EXPECT_EQ(open_table(p.tree, "/moved", RG_MODE_WRITE), table);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rows_by_id(table), (rows{{1, 10}, {2, 20}}));
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(p.code_at("/moved"), RG_E_NO_SUCH_TABLE) << "the last handle takes it away";
}

TEST(a_move_in_memory, of_a_table_whose_file_can_not_be_removed_leaves_its_place_all_the_same)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}});
    {
        fault_scope faults;
        fail_call(call::unlink, 1, EACCES);
        EXPECT_EQ(move_by_handle(table, "/moved"), 0);
    }
    EXPECT_EQ(open_table(p.tree, "/moved", RG_MODE_WRITE), table);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_EQ(p.rows_at("/r/t"), (rows{{1, 10}}));
}

TEST(a_move_in_memory, finds_its_target_again_when_the_tree_has_changed)
{
    // Many names, so that taking the source out moves others about.
    for (int source = 0; source < 12; ++source)
        for (int target = 0; target < 12; ++target) {
            if (source == target)
                continue;
            places p;
            for (std::uint32_t i = 0; i < 12; ++i)
                p.create_and_close("/t" + std::to_string(i), {{i, 0}});
            ASSERT_EQ(move_by_name(p.tree, "/t" + std::to_string(source), "/t" + std::to_string(target), 1), 0);
            for (int i = 0; i < 12; ++i) {
                kt_int32_t rc   = 0;
                const rows seen = p.rows_at("/t" + std::to_string(i), &rc);
                EXPECT_EQ(rc, i == source ? RG_E_NO_SUCH_TABLE : 0);
                if (i != source) {
                    EXPECT_EQ(seen, (rows{{static_cast<std::uint32_t>(i == target ? source : i), 0}}));
                }
            }
        }
}

// ---- Bad luck ----

TEST(a_copy_in_memory, without_memory_changes_nothing)
{
    for (const bool hashed : {false, true})
        for (const bool target_is_there : {false, true}) {
            places             p;
            rg_opaque_handle_t source = p.create("/t", {{1, 10}, {2, 20}}, RG_MODE_WRITE, hashed);
            kt_binary_t        binary{1, {1}};
            ASSERT_EQ(rg_set_application_metadata_1(source, &binary), 0);
            if (target_is_there)
                p.create_and_close("/copy", {{7, 70}});
            fail_each_allocation([&] { return copy_by_handle(source, "/copy", 1); },
                                 [&](kt_int32_t rc) {
                                     kt_int32_t open_rc = 0;
                                     const rows seen    = p.rows_at("/copy", &open_rc);
                                     if (rc == 0) {
                                         EXPECT_EQ(seen, (rows{{1, 10}, {2, 20}}));
                                     } else if (target_is_there) {
                                         EXPECT_EQ(seen, (rows{{7, 70}}));
                                     } else {
                                         EXPECT_EQ(open_rc, RG_E_NO_SUCH_TABLE);
                                     }
                                     EXPECT_EQ(p.rows_at("/t"), (rows{{1, 10}, {2, 20}}));
                                 });
            EXPECT_EQ(rg_close_table_1(source), 0);
        }
}

TEST(a_move_in_memory, without_memory_changes_nothing)
{
    for (const char * path : {"/t", "/r/t", "/r/file"}) {
        places             p;
        rg_opaque_handle_t source = p.create(path, {{1, 10}});
        if (path == std::string("/r/file")) {
            ASSERT_EQ(rg_close_table_1(std::exchange(source, nullptr)), 0);
        }
        fail_each_allocation([&] { return move_by_name(p.tree, path, "/moved"); },
                             [&](kt_int32_t rc) {
                                 EXPECT_EQ(p.rows_at(rc == 0 ? "/moved" : path), (rows{{1, 10}})) << path;
                                 EXPECT_EQ(p.code_at(rc == 0 ? path : "/moved"), RG_E_NO_SUCH_TABLE) << path;
                             });
        if (source != nullptr) {
            EXPECT_EQ(rg_close_table_1(source), 0);
        }
    }
}

} // namespace kt_test
