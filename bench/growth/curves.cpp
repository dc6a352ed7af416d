// SPDX-License-Identifier: MIT
#include "curves.h"

#include <algorithm>
#include <set>
#include <sstream>
#include <stdexcept>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "common/require.h"

namespace growth
{

namespace
{

constexpr auto cpu  = clock_kind::processor;
constexpr auto wall = clock_kind::wall;

constexpr const char * exported[] = {
#include "exported_names.inc"
};

// What the definitions make calls look at. A place is a cache line in the memory of a table that is larger than the caches.
constexpr const char * by_key     = "bucket, slot, record";
constexpr const char * by_key_5   = "bucket, slot, record of three cache lines, its values copied";
constexpr const char * by_index   = "packed index, slot, record";
constexpr const char * by_index_5 = "packed index, slot, record of three cache lines, its values copied";
constexpr const char * by_fixed   = "slot, record";
constexpr const char * by_fixed_5 = "slot, record of three cache lines, its values copied";
constexpr const char * setting =
    "the row as a read finds it, its old record, room for the new one and the pool's index "
    "beside it, the change";
constexpr const char * adding = "slot and the index of free ones, room for the record and the pool's index beside it, "
                                "bucket and the element there, packed index, the change";
constexpr const char * finishing =
    "change, slot, both records, the pool's index and chain beside the old one, hash element";
constexpr const char * removing =
    "change, slot, record, the pool's index and chain beside it, bucket and elements, packed "
    "index and the slot that moves in it, the free slot below and the index of free ones";
constexpr const char * each_row     = "each row's slot and record, in the order of the slots";
constexpr const char * rebuilt      = "each row's record read, a new one written, its bucket and the element there";
constexpr const char * one_row_sync = "two syncs, and the row's places in memory";
constexpr const char * in_a_file    = "each row read and written, by the processor and by the disk";

constexpr curve all[] = {
    // ---- One row read ----
    {"get_field_by_key", family::reads, "call", "rg_get_field_by_key_1", cpu, 4, by_key},
    {"get_field_by_key_visibility", family::reads, "call", "rg_get_field_by_key_and_visibility_1", cpu, 4, by_key},
    {"get_fields_by_key", family::reads, "call", "rg_get_fields_by_key_1", cpu, 6, by_key_5},
    {"get_fields_by_key_visibility", family::reads, "call", "rg_get_fields_by_key_and_visibility_1", cpu, 6, by_key_5},
    {"get_field_by_key, no hash", family::reads, "call", "rg_get_field_by_key_1", cpu, 5,
     "index of keys, packed index, slot, record"},
    {"get_field_by_index", family::reads, "call", "rg_get_field_by_index_1", cpu, 4, by_index},
    {"get_field_by_index_visibility", family::reads, "call", "rg_get_field_by_index_and_visibility_1", cpu, 4,
     by_index},
    {"get_fields_by_index", family::reads, "call", "rg_get_fields_by_index_1", cpu, 6, by_index_5},
    {"get_fields_by_index_visibility", family::reads, "call", "rg_get_fields_by_index_and_visibility_1", cpu, 6,
     by_index_5},
    {"get_field_by_fixed_index", family::reads, "call", "rg_get_field_by_fixed_index_and_visibility_1", cpu, 3,
     by_fixed},
    {"get_fields_by_fixed_index", family::reads, "call", "rg_get_fields_by_fixed_index_and_visibility_1", cpu, 5,
     by_fixed_5},
    {"get_fixed_row_index_for_key", family::reads, "call", "rg_get_fixed_row_index_for_key_1", cpu, 4, by_key},
    {"get_duplicate_rows", family::reads, "call", "rg_get_duplicate_rows_1", cpu, 4, by_key},

    // ---- One row changed; explicit control, a thousand rows a transaction ----
    {"set_field_by_key", family::changes, "call", "rg_set_field_by_key_1", cpu, 12, setting},
    {"set_fields_by_key", family::changes, "call", "rg_set_fields_by_key_1", cpu, 12, setting},
    {"set_field_by_index", family::changes, "call", "rg_set_field_by_index_1", cpu, 12, setting},
    {"set_fields_by_index", family::changes, "call", "rg_set_fields_by_index_1", cpu, 12, setting},
    {"set_field_by_fixed_index", family::changes, "call", "rg_set_field_by_fixed_index_1", cpu, 12, setting},
    {"set_fields_by_fixed_index", family::changes, "call", "rg_set_fields_by_fixed_index_1", cpu, 12, setting},
    {"add_row", family::changes, "call", "rg_add_row_1", cpu, 12, adding},
    {"add_row, no hash", family::changes, "call", "rg_add_row_1", cpu, 12,
     "the same with the index of keys for the buckets"},
    {"delete_row_by_index", family::changes, "call", "rg_delete_row_by_index_1", cpu, 4,
     "packed index, slot, the change"},
    {"apply", family::changes, "pending row", "rg_apply_1", cpu, 4, "change, slot, record"},
    {"commit", family::changes, "row set", "rg_commit_1", cpu, 10, finishing},
    {"commit of adds", family::changes, "row added", "rg_commit_1", cpu, 10, finishing},
    {"commit of deletes", family::changes, "row deleted", "rg_commit_1", cpu, 16, removing},
    {"abort", family::changes, "row set", "rg_abort_1", cpu, 10, finishing},
    {"get_updated_rows", family::changes, "pending row", "rg_get_updated_rows_1", cpu, 2, "change"},
    {"set, apply, commit", family::changes, "transaction", "rg_set_field_by_key_1 rg_apply_1 rg_commit_1", cpu, 20,
     "setting and committing as above"},
    {"add, apply, commit", family::changes, "transaction", "rg_add_row_1 rg_apply_1 rg_commit_1", cpu, 20,
     "adding and committing as above"},
    {"delete, apply, commit", family::changes, "transaction", "rg_delete_row_by_index_1 rg_apply_1 rg_commit_1", cpu,
     20, "deleting and committing as above"},

    // ---- Calls that concern no row ----
    {"open_tree, close_tree", family::calls, "pair", "rg_open_tree_1 rg_close_tree_1", cpu, 2, "an empty tree"},
    {"mount, unmount", family::calls, "pair", "rg_mount_local_tree_1 rg_unmount_local_tree_1", cpu, 2,
     "a directory that exists"},
    {"create_table, close, delete", family::calls, "three calls",
     "rg_create_table_1 rg_close_table_1 rg_delete_table_1", cpu, 4, "an empty table in the same tree"},
    {"open_table, close_table", family::calls, "pair", "rg_open_table_1 rg_close_table_1", cpu, 4,
     "a table that is in memory"},
    {"open_hashed_key_table, close_table", family::calls, "pair", "rg_open_hashed_key_table_1 rg_close_table_1", cpu, 4,
     "an array of as many buckets as the table has rows is made ahead of the search, and given back since the table "
     "that "
     "is found in memory keeps its own",
     true},
    {"list_tables", family::calls, "pair", "rg_list_tables_1 rg_free_table_list_1", cpu, 2, "two tables in the tree"},
    {"directory list", family::calls, "four calls",
     "rg_i_get_directory_list_compat rg_i_free_directory_list_compat rg_i_create_directory_compat "
     "rg_i_delete_directory_compat",
     cpu, 2, "the same in an older shape"},
    {"get_table_metadata", family::calls, "pair", "rg_get_table_metadata_1 rg_free_table_metadata_1", cpu, 2,
     "the columns"},
    {"overlay_default_value", family::calls, "call", "rg_overlay_memory_default_value_1", cpu, 2, "a column"},
    {"overlay_column_qualifier", family::calls, "call", "rg_overlay_memory_column_qualifier_1", cpu, 2, "a column"},
    {"set_application_metadata", family::calls, "two calls", "rg_set_application_metadata_1 rg_abort_1", cpu, 2,
     "the binary"},
    {"get_application_metadata", family::calls, "call", "rg_get_application_metadata_1", cpu, 2, "the binary"},
    {"move_table_by_handle", family::calls, "call", "rg_move_table_by_handle_1", cpu, 2,
     "the table's name in its tree"},
    {"move_table_by_name", family::calls, "call", "rg_move_table_by_name_1", cpu, 2, "the table's name in its tree"},
    {"get_total_packed_tables", family::calls, "call", "rg_get_total_packed_tables_1", cpu, 2, "the buffer's head"},
    {"get_packed_table_name", family::calls, "call", "rg_get_packed_table_name_1", cpu, 2, "the buffer's directory"},
    {"convert, own order", family::calls, "call", "rg_convert_packed_table_buffer_1", cpu, 2, "the buffer's head"},

    // ---- All rows, in memory ----
    {"create_hashed_key_table", family::rows, "row to come", "rg_create_hashed_key_table_1", cpu, 0,
     "an array with a place for each bucket, as many as rows are to come"},
    {"select, all", family::rows, "row", "rg_select_1", cpu, 8, rebuilt},
    {"select, a hundredth", family::rows, "row", "rg_select_1", cpu, 2, each_row},
    {"get_selected_rows_v", family::rows, "row", "rg_get_selected_rows_v_1", cpu, 2, each_row},
    {"get_duplicate_rows, no hash", family::rows, "row", "rg_get_duplicate_rows_1", cpu, 2, each_row},
    {"delete_rows, a hundredth", family::rows, "row", "rg_delete_rows_1", cpu, 2, each_row},
    {"delete_rows, all", family::rows, "row", "rg_delete_rows_1 rg_apply_1 rg_commit_1", cpu, 16, removing},
    {"copy_table_by_handle", family::rows, "row", "rg_copy_table_by_handle_1", cpu, 8, rebuilt},
    {"copy_table_by_name", family::rows, "row", "rg_copy_table_by_name_1", cpu, 8, rebuilt},
    {"delete_table", family::rows, "row", "rg_delete_table_1", cpu, 2, "each row's hash element given back"},
    {"close_tree", family::rows, "row", "rg_close_tree_1", cpu, 2, "each row's hash element given back"},
    {"pack_tables", family::rows, "row", "rg_pack_tables_1", cpu, 4, each_row},
    {"convert, other order", family::rows, "row", "rg_convert_packed_table_buffer_1", cpu, 2,
     "each row's words turned, in the order of the buffer"},
    {"unpack_table", family::rows, "row", "rg_unpack_table_1", cpu, 8, rebuilt},
    {"dump_table", family::rows, "row", "rg_i_dump_table", cpu, 4, each_row},
    {"dump_tree", family::rows, "row", "rg_i_dump_tree", cpu, 4, each_row},

    // ---- Columns, in memory ----
    {"add_columns", family::columns, "row", "rg_add_columns_1", cpu, 12, rebuilt},
    {"delete_columns", family::columns, "row", "rg_delete_columns_1", cpu, 12, rebuilt},
    {"change_column_name", family::columns, "row", "rg_change_column_name_1", cpu, 12, rebuilt},
    {"change_default_value", family::columns, "row", "rg_change_default_value_1", cpu, 12, rebuilt},

    // ---- Files ----
    {"create_table, file", family::calls, "three calls", "rg_create_table_1 rg_close_table_1 rg_delete_table_1", wall,
     4, "an empty table with a file"},
    {"repair_tables", family::calls, "call", "rg_repair_tables_1", wall, 4, "the name of a rewrite file"},
    {"open_table, file", family::files, "row", "rg_open_table_1", cpu, 8,
     "each record of the file read once; for one that replaces another the note of where records start, the record "
     "that "
     "it names, the slot, the replaced record, the pool's index and chain beside that"},
    {"open_hashed_key_table, file", family::files, "row", "rg_open_hashed_key_table_1", cpu, 11,
     "the same, and each row's bucket and the element there"},
    {"close_table, file", family::files, "row", "rg_close_table_1", cpu, 2, "each row's hash element given back"},
    {"copy_table_by_handle, file", family::files, "row", "rg_copy_table_by_handle_1", wall, 4, in_a_file},
    {"copy_table_by_name, file", family::files, "row", "rg_copy_table_by_name_1", wall, 4,
     "the bytes of the file, copied as they are"},
    {"move_table_by_name, file", family::calls, "call", "rg_move_table_by_name_1", wall, 4, "the name of the file"},
    {"move_table_by_handle, file", family::files, "row", "rg_move_table_by_handle_1", wall, 4,
     "a table in memory written to a file, and given back"},
    {"delete_table, file", family::files, "row", "rg_delete_table_1", wall, 2,
     "the blocks of the file, which its file system gives back"},
    {"add_columns, file", family::files, "row", "rg_add_columns_1", wall, 12, in_a_file},
    {"delete_columns, file", family::files, "row", "rg_delete_columns_1", wall, 12, in_a_file},
    {"change_column_name, file", family::files, "row", "rg_change_column_name_1", wall, 12, in_a_file},
    {"change_default_value, file", family::files, "row", "rg_change_default_value_1", wall, 12, in_a_file},

    // ---- Durable transactions of one row ----
    {"durable set", family::transactions, "transaction", "rg_set_field_by_key_1 rg_apply_1 rg_commit_1", wall, 20,
     one_row_sync},
    {"durable add", family::transactions, "transaction", "rg_add_row_1 rg_apply_1 rg_commit_1", wall, 20, one_row_sync},
    {"durable delete", family::transactions, "transaction", "rg_delete_row_by_index_1 rg_apply_1 rg_commit_1", wall, 20,
     one_row_sync},
    {"first after opening 10 versions", family::files, "row", "rg_set_field_by_key_1 rg_apply_1 rg_commit_1", wall, 12,
     "more than half of the file is dead, so it is written anew"},

    // ---- The machine ----
    {"memory access", family::machine, "access", "", cpu, 1, "a pointer followed to a random place in 200 bytes a row",
     true},
    {"fsync pair", family::machine, "pair", "", wall, 0, "what the disk took at that time", true},
};

std::vector<std::string> words_of(const char * p_text)
{
    std::istringstream       stream(p_text);
    std::vector<std::string> words;
    for (std::string word; stream >> word;)
        words.push_back(word);
    return words;
}

} // namespace

std::string_view name_of(state s)
{
    constexpr std::string_view names[] = {"fresh", "churned", "10 versions", "reopened"};
    return names[static_cast<int>(s)];
}

std::string_view title_of(family f)
{
    constexpr std::string_view titles[] = {
        "One row read",
        "One row changed, in memory",
        "Calls that concern no row",
        "All rows, in memory",
        "Columns changed, in memory",
        "All rows, with a file",
        "Durable transactions of one row",
        "The machine",
    };
    return titles[static_cast<int>(f)];
}

std::span<const curve> curves()
{
    return all;
}

const curve & curve_of(std::string_view name)
{
    const auto found = std::find_if(std::begin(all), std::end(all), [&](const curve & c) { return c.name == name; });
    require(found != std::end(all), fmt::format("there is no curve \"{}\"", name));
    return *found;
}

void check_names()
{
    std::set<std::string> left(std::begin(exported), std::end(exported));
    std::set<std::string> unknown;
    for (const curve & c : all)
        for (const std::string & function : words_of(c.functions)) {
            if (std::find(std::begin(exported), std::end(exported), function) == std::end(exported))
                unknown.insert(function);
            left.erase(function);
        }
    require(left.empty(), fmt::format("no curve measures {}", fmt::join(left, ", ")));
    require(unknown.empty(), fmt::format("the library exports no {}", fmt::join(unknown, ", ")));
}

} // namespace growth
