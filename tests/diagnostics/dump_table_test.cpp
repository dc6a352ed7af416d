// SPDX-License-Identifier: MIT
// Dumps of tables and trees, line for line. Addresses differ from run to run: "0x" and the digits behind it read as
// "@".
#include <unistd.h>

#include <cstdlib>
#include <regex>

#include "diagnostics/rg_i_dump_table.h"
#include "whole/places.h"

namespace kt_test
{

namespace
{

std::string masked(const std::string & dump)
{
    return std::regex_replace(std::regex_replace(dump, std::regex("0x[0-9a-f]{12}"), "@"),
                              std::regex("0x[0-9a-f]{1,8}"), "@");
}

template <class Action> std::string what_is_printed(Action action)
{
    char * p_text = nullptr;
    size_t length = 0;
    FILE * p_file = open_memstream(&p_text, &length);
    action(p_file);
    std::fclose(p_file);
    const std::string result(p_text, length);
    std::free(p_text);
    return result;
}

std::string dump_of(rg_opaque_handle_t table, kt_uint64_t detail_flags)
{
    return what_is_printed([&](FILE * p_file) {
        EXPECT_EQ(rg_i_dump_table(static_cast<rg_i_table_t *>(table), p_file, detail_flags), 0);
    });
}

constexpr kt_uint64_t everything_but_the_pool = ~kt_uint64_t{RG_I_DUMP_POOL};

} // namespace

TEST(a_dump, with_no_detail_prints_nothing_at_all)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}});
    EXPECT_EQ(dump_of(table, 0), "");
    EXPECT_EQ(dump_of(nullptr, 0), "");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_no_table_is_its_first_line)
{
    EXPECT_EQ(dump_of(nullptr, RG_I_DUMP_ALL), "Table p_table(0x00000000)\n");
}

TEST(a_dump, of_a_transient_table_line_for_line)
{
    places             p;
    rg_column_t        name  = column("name", KT_CHAR_PTR, RG_STANDARD | RG_PROTECTED | RG_INVISIBLE, string("abc"));
    rg_opaque_handle_t table = create_table(
        p.tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY, uint32(9)), name, column("ratio", KT_FLOAT64)},
        explicit_writing);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"ratio", float64(0.5)}}), 0);
    ASSERT_EQ(commit(table), 0);
    ASSERT_EQ(rg_delete_row_by_index_1(table, 0), 0);
    ASSERT_EQ(add_row(table, {{"id", uint32(2)}, {"ratio", float64(2)}}), 0);
    EXPECT_EQ(masked(dump_of(table, everything_but_the_pool)),
              "Table p_table(@)\n"
              "  p_name(/t)\n"
              "  references(1)\n"
              "  total_columns(3)\n"
              "  column(0)\n"
              "    name(id)\n"
              "    type(KT_UINT32)\n"
              "    qualifier(RG_PRIMARY_KEY)\n"
              "    properties(0)\n"
              "    sd_defn(@)\n"
              "    default_value: 9\n"
              "  column(1)\n"
              "    name(name)\n"
              "    type(KT_CHAR_PTR)\n"
              "    qualifier(RG_STANDARD)\n"
              "    qualifier_modifiers(RG_PROTECTED|RG_INVISIBLE)\n"
              "    properties(0)\n"
              "    sd_defn(@)\n"
              "    default_value: abc\n"
              "  column(2)\n"
              "    name(ratio)\n"
              "    type(KT_FLOAT64)\n"
              "    qualifier(RG_STANDARD)\n"
              "    properties(0)\n"
              "    sd_defn(@)\n"
              "    default_value: 0\n"
              "  total_applied_rows(2) total_committed_rows(1) maximum_rows(100)\n"
              "  applied_deletions(1)\n"
              "  row(0) p_applied(@) p_committed(@) p_pending_change(@) file_offset(0) applied_file_offset(0)\n"
              "    APPLIED ROW RECORD: NONE\n"
              "    COMMITTED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
              "      column(0): 1\n"
              "      column(1): abc\n"
              "      column(2): 0.5\n"
              "  row(1) p_applied(@) p_committed(@) p_pending_change(@) file_offset(0) applied_file_offset(0)\n"
              "    APPLIED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
              "      column(0): 2\n"
              "      column(1): abc\n"
              "      column(2): 2\n"
              "    COMMITTED ROW RECORD: NONE\n"
              "  p_metadata_record_data(@)\n"
              "  p_columns(@)\n"
              "  total_variable_length_columns(1)\n"
              "  p_rows_fixed_index(@)\n"
              "  p_rows_packed_index(@)\n"
              "  p_rows_change_list(@)\n"
              "  p_rows_change_list_tail(@)\n"
              "  p_delete_rows_change_list(@)\n"
              "  p_delete_rows_change_list_tail(@)\n"
              "  implicitly_controlled(0)\n"
              "  uncommitted_updates_visible(0)\n"
              "  change_counter(2)\n"
              "  applied_change_counter(2)\n"
              "  p_tree(@)\n"
              "  p_next(@)\n"
              "  mode(2)\n"
              "  block_size(0)\n"
              "  ready_for_commit(0)\n"
              "  file_fd(-1)\n"
              "  rewrite_file_fd(-1)\n"
              "  p_file_path(@)\n"
              "  file_path_length(0)\n"
              "  commit_record_offset(0)\n"
              "  applied_commit_record_offset(0)\n"
              "  commit_record_length(0)\n"
              "  applied_commit_record_length(0)\n"
              "  file_length(0)\n"
              "  rewrite_file_length(0)\n"
              "  p_persistent_table_registry_path()\n"
              "  p_application_metadata(@)\n"
              "    max_elements(1)\n"
              "    total_elements(0)\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_the_rows_alone_has_one_line_for_each_slot_in_use)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}, {2, 20}, {3, 30}});
    ASSERT_EQ(remove(table, 2), 0);
    EXPECT_EQ(masked(dump_of(table, 4096)),
              "Table p_table(@)\n"
              "  row(0) p_applied(@) p_committed(@) p_pending_change(@) file_offset(0) applied_file_offset(0)\n"
              "  row(2) p_applied(@) p_committed(@) p_pending_change(@) file_offset(0) applied_file_offset(0)\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_the_pointers_alone_leaves_the_line_of_the_file_path_without_an_end)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}});
    const std::string  dump  = masked(dump_of(table, 32768));
    EXPECT_EQ(dump, "Table p_table(@)\n"
                    "  p_metadata_record_data(@)\n  p_columns(@)\n  p_rows_fixed_index(@)\n  p_rows_packed_index(@)\n"
                    "  p_rows_change_list(@)\n  p_rows_change_list_tail(@)\n  p_delete_rows_change_list(@)\n"
                    "  p_delete_rows_change_list_tail(@)\n  p_tree(@)\n  p_next(@)\n  p_file_path(@)");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_the_file_fields_shows_the_path_and_sets_the_path_buffer_to_the_data_file)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}});
    const std::string  path  = p.dir.file("t");
    rg_i_set_rewrite_path(&object(table));
    EXPECT_NE(dump_of(table, 32768), "");
    EXPECT_EQ(object(table).p_file_path, path + ".rewrite") << "it isn't printed, so it isn't set";
    const std::string dump = masked(dump_of(table, 4194304));
    EXPECT_NE(dump.find("  mode(2)\n  block_size(512)\n  ready_for_commit(0)\n"), std::string::npos) << dump;
    EXPECT_NE(dump.find("\n file_path(" + path + ")\n  file_path_length(" + std::to_string(path.size()) + ")\n"),
              std::string::npos)
        << dump;
    EXPECT_NE(dump.find("  p_persistent_table_registry_path(/r/t)\n"), std::string::npos);
    EXPECT_EQ(object(table).p_file_path, path);
    EXPECT_NE(masked(dump_of(table, 4194304 | 32768)).find("  p_file_path(@) file_path(" + path + ")\n"),
              std::string::npos);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, prints_each_detail_under_its_own_bit_and_in_one_place)
{
    places             p;
    rg_opaque_handle_t table = p.create("/r/t", {{1, 10}}, explicit_writing);
    ASSERT_EQ(set(table, 1, 11), 0);
    kt_binary_t binary{1, {7}};
    ASSERT_EQ(rg_set_application_metadata_1(table, &binary), 0);
    const std::string first = dump_of(table, kt_uint64_t{1} << 40); // a bit that selects nothing else
    EXPECT_EQ(masked(first), "Table p_table(@)\n");
    const std::string all = dump_of(table, RG_I_DUMP_ALL);
    size_t            sum = first.size();
    for (kt_uint64_t bit = 1; bit <= RG_I_DUMP_POOL; bit <<= 1) {
        const std::string one = dump_of(table, bit);
        EXPECT_EQ(one.substr(0, first.size()), first) << bit;
        EXPECT_TRUE(one.size() > first.size() || bit == RG_I_DUMP_COLUMN_MODIFIERS) << bit;
        sum += one.size() - first.size();
    }
    EXPECT_EQ(sum, all.size()) << "nothing is printed twice, or under two bits";
    EXPECT_EQ(rg_abort_1(table), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_an_unsigned_64_bit_value_above_the_signed_range_is_negative)
{
    places             p;
    rg_opaque_handle_t table = create_table(p.tree, "/t",
                                            {column("id", KT_UINT64, RG_PRIMARY_KEY), column("i", KT_INT32),
                                             column("f", KT_FLOAT32), column("n", KT_INT64)},
                                            RG_MODE_WRITE);
    ASSERT_EQ(
        add_row(table, {{"id", uint64(0xFFFFFFFFFFFFFFFE)}, {"i", int32(-7)}, {"f", float32(1.5f)}, {"n", int64(-9)}}),
        0);
    EXPECT_EQ(masked(dump_of(table, 8192)), "Table p_table(@)\n"
                                            "    APPLIED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
                                            "      column(0): -2\n      column(1): -7\n      column(2): 1.5\n"
                                            "      column(3): -9\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_a_modifier_above_the_known_ones_has_nothing_between_the_parentheses)
{
    places             p;
    rg_opaque_handle_t table             = p.create("/t", {});
    object(table).p_columns[1].qualifier = RG_STANDARD | 128;
    EXPECT_EQ(masked(dump_of(table, 128)), "Table p_table(@)\n    qualifier_modifiers()\n");
    object(table).p_columns[1].qualifier = RG_STANDARD | RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED | 128;
    EXPECT_EQ(masked(dump_of(table, 128)),
              "Table p_table(@)\n    qualifier_modifiers(RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED)\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_garbled_types_and_qualifiers_says_so_and_goes_on)
{
    places             p;
    rg_opaque_handle_t table             = p.create("/t", {{1, 10}});
    object(table).p_columns[1].type      = 23;
    object(table).p_columns[1].qualifier = 15;
    const std::string dump               = masked(dump_of(table, 32 | 64 | 1024 | 8192));
    EXPECT_EQ(dump, "Table p_table(@)\n"
                    "    type(KT_UINT32)\n    qualifier(RG_PRIMARY_KEY)\n    default_value: 0\n"
                    "    type(GARBAGE)\n    qualifier(GARBAGE)\n    default_value: GARBAGE\n"
                    "    APPLIED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
                    "      column(0): 1\n      column(1): GARBAGE\n");
    object(table).p_columns[1].type = KT_INT64;
    EXPECT_EQ(rg_close_table_1(table), 0);
    EXPECT_STREQ(rg_i_get_type_string(KT_UNKNOWN), "KT_UNKNOWN");
    EXPECT_STREQ(rg_i_get_type_string(KT_SD_PTR_ARRAY), "KT_SD_PTR_ARRAY");
    EXPECT_STREQ(rg_i_get_type_string(0xFFFFFFFF), "GARBAGE");
    EXPECT_STREQ(rg_i_get_qualifier_type_string(RG_PROTECTED), "RG_UNKNOWN_QUALIFIER");
    EXPECT_STREQ(rg_i_get_qualifier_type_string(RG_SYSTEM), "RG_SYSTEM");
    EXPECT_STREQ(rg_i_get_qualifier_type_string(RG_PRIMARY_KEY_NOCHECK), "RG_PRIMARY_KEY_NOCHECK");
}

TEST(a_dump, of_65_bytes_has_two_lines_and_the_column_ends_the_second)
{
    places             p;
    rg_opaque_handle_t table = create_table(
        p.tree, "/t",
        {column("id", KT_UINT32, RG_PRIMARY_KEY), column("data", KT_BINARY_PTR, RG_STANDARD, null_value())},
        RG_MODE_WRITE);
    // The stored form of a binary is its length word and its bytes: 61 of them make 65.
    std::vector<kt_uint8_t> storage(sizeof(kt_binary_t) + 61);
    auto *                  p_binary = reinterpret_cast<kt_binary_t *>(storage.data());
    p_binary->length                 = 61;
    std::memset(p_binary->data, 0xAB, 61);
    kt_value_t value;
    value.ptr_binary = p_binary;
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}, {"data", value}}), 0);
    std::string first = "3d000000 ";
    for (int i = 0; i < 15; ++i)
        first += "abababab ";
    EXPECT_EQ(masked(dump_of(table, 8192)), "Table p_table(@)\n"
                                            "    APPLIED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
                                            "      column(0): 1\n"
                                            "      column(1): length(65) data:\n"
                                            "      @" +
                                                first +
                                                "\n"
                                                "      @ab\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_bytes_shows_groups_of_four_behind_their_address)
{
    const kt_uint8_t bytes_shown[10] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 255};
    char             address[2][32];
    std::snprintf(address[0], sizeof address[0], "%p", static_cast<const void *>(bytes_shown));
    std::snprintf(address[1], sizeof address[1], "%p", static_cast<const void *>(bytes_shown + 8));
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { rg_i_dump_storage(bytes_shown, 10, 2, "> ", p_file, 1, 1); }),
              "> " + std::string(address[0]) + "00010203 04050607 \n> " + address[1] + "08ff");
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { rg_i_dump_storage(bytes_shown, 4, 16, nullptr, p_file, 1, 1); }),
              std::string(address[0]) + "00010203 ");
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { rg_i_dump_storage(bytes_shown, 10, 2, "> ", p_file, 1, 2); }), "");
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { rg_i_dump_storage(bytes_shown, 0, 2, "> ", p_file, 1, 1); }), "");
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { EXPECT_EQ(rg_i_printf(3, 2, p_file, "%d", 12), 2); }), "12");
    EXPECT_EQ(what_is_printed([&](FILE * p_file) { EXPECT_EQ(rg_i_printf(1, 2, p_file, "%d", 12), 0); }), "");
}

TEST(a_dump, of_structured_data_walks_the_packed_definition_also_in_a_copy_whose_source_is_gone)
{
    places         p;
    kt_uint8_t     storage[sizeof(rg_sd_def_t) + sizeof(rg_field_def_t)];
    auto *         p_definition    = reinterpret_cast<rg_sd_def_t *>(storage);
    rg_field_def_t fields[2]       = {{KT_INT32, text("a")}, {KT_CHAR_PTR, text("second")}};
    p_definition->number_of_fields = 2;
    std::memcpy(static_cast<void *>(p_definition->fields), fields, sizeof fields);
    rg_column_t structured = column("s", KT_SD_PTR, RG_STANDARD, null_value());
    structured.sd_defn     = p_definition;
    ASSERT_EQ(rg_close_table_1(
                  create_table(p.tree, "/t", {column("id", KT_UINT32, RG_PRIMARY_KEY), structured}, RG_MODE_WRITE)),
              0);
    ASSERT_EQ(copy_by_name(p.tree, "/t", "/copy"), 0);
    const auto dump = [&](const char * path) {
        rg_opaque_handle_t table  = open_table(p.tree, path, RG_MODE_READ);
        std::string        result = dump_of(table, 512);
        EXPECT_EQ(rg_close_table_1(table), 0);
        return result.substr(result.find('\n'));
    };
    const std::string of_source = dump("/t");
    EXPECT_EQ(masked(of_source), "\n    sd_defn(@)\n    sd_defn(@)\n        number_of_fields(2)\n"
                                 "            type(KT_INT32)\n            name(a)\n"
                                 "            type(KT_CHAR_PTR)\n            name(second)\n");
    ASSERT_EQ(rg_delete_table_1(p.tree, text("/t")), 0);
    EXPECT_EQ(dump("/copy"), of_source) << "addresses and all";
}

TEST(a_dump, of_the_application_metadata_shows_both_versions)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {}, explicit_writing);
    kt_binary_t        binary{1, {0xAB}};
    ASSERT_EQ(rg_set_application_metadata_1(table, &binary), 0);
    EXPECT_EQ(masked(dump_of(table, 65536)), "Table p_table(@)\n"
                                             "  p_application_metadata(@)\n"
                                             "    max_elements(1)\n"
                                             "    total_elements(1)\n"
                                             "      0: type(0) p_applied(@) p_committed(@)\n"
                                             "        APPLIED: length(1), data:\n"
                                             "        @ab\n"
                                             "        COMMITTED: NONE\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_the_pool_adds_the_records_up_to_the_pools_own_counters)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}, {2, 20}});
    ASSERT_EQ(remove(table, 1), 0);
    const std::string dump  = masked(dump_of(table, 8388608));
    const auto &      pool  = object(table).record_buffer_pool;
    const std::string total = std::to_string(pool.total_bytes), used = std::to_string(pool.used_bytes);
    EXPECT_EQ(dump.rfind("Table p_table(@)\nrecord buffer pool address(@)\n  total_bytes(" + total +
                             ")\n  used_bytes(" + used +
                             ")\n  p_free_chain(@)\n  p_first_record_buffer(@)\n  p_last_record_buffer(@)\n"
                             "  record_buffer(0:@)\n    total_bytes(",
                         0),
              0u)
        << dump;
    EXPECT_NE(dump.find("    p_next(@)\n    record(0:@) length("), std::string::npos) << dump;
    EXPECT_NE(dump.find(") type(1) p_next_free(@)\n"), std::string::npos) << "the metadata record";
    EXPECT_NE(dump.find(") type(2) p_next_free(@)\n"), std::string::npos) << "a row";
    EXPECT_NE(dump.find(") type(0) p_next_free(@)\n"), std::string::npos) << "what is free";
    const std::string sums = "  cumulative_total_bytes(" + total + ")\n  cumulative_used_bytes(" + used + ")\n";
    EXPECT_EQ(dump.substr(dump.size() - sums.size()), sums);

    const std::string plain = dump_of(table, 8388608);
    char              first[64];
    std::snprintf(first, sizeof first, "record(0:0x%.8x)",
                  static_cast<unsigned>(reinterpret_cast<uintptr_t>(pool.p_first_record_buffer)) + 12u);
    EXPECT_NE(plain.find(first), std::string::npos) << "a record's address is its head's";
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, prints_the_low_32_bits_of_pointers)
{
    places             p;
    rg_opaque_handle_t table = p.create("/t", {});
    char               first[64];
    std::snprintf(first, sizeof first, "Table p_table(0x%.8x)\n",
                  static_cast<unsigned>(reinterpret_cast<uintptr_t>(table)));
    EXPECT_EQ(dump_of(table, 1), std::string(first) + "  p_name(/t)\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST(a_dump, of_a_damaged_row_stays_inside_its_record)
{
    places             p;
    rg_opaque_handle_t table =
        create_table(p.tree, "/t",
                     {column("id", KT_UINT32, RG_PRIMARY_KEY), column("name", KT_CHAR_PTR, RG_STANDARD, string("x")),
                      column("data", KT_BINARY_PTR, RG_STANDARD, null_value())},
                     RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"id", uint32(1)}}), 0);
    kt_char_ptr_t                p_record = object(table).p_rows_fixed_index[0].p_applied;
    const kt_pmsg_value_anchor_t beyond{0xFFFFFF00u, 0xFFFFFFFFu};
    std::memcpy(rg_i_row_slot(p_record, 1), &beyond, sizeof beyond);
    std::memcpy(rg_i_row_slot(p_record, 2), &beyond, sizeof beyond);
    EXPECT_EQ(masked(dump_of(table, 8192)), "Table p_table(@)\n"
                                            "    APPLIED ROW RECORD: replaces_offset(0), COLUMN VALUES:\n"
                                            "      column(0): 1\n      column(1): \n"
                                            "      column(2): length(4294967295) data:\n\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

// ---- Trees ----

namespace
{

std::string tree_dump_of(rg_i_tree_t * p_tree)
{
    temp_dir          dir;
    const std::string path = dir.file("out");
    std::fflush(stdout);
    const int saved = dup(STDOUT_FILENO);
    FILE *    p     = std::freopen(path.c_str(), "w", stdout);
    EXPECT_NE(p, nullptr);
    EXPECT_EQ(rg_i_dump_tree(p_tree), 0);
    std::fflush(stdout);
    dup2(saved, STDOUT_FILENO);
    close(saved);
    const bytes content = read_file(path);
    return {content.begin(), content.end()};
}

} // namespace

TEST(a_dump_of_a_tree, prints_its_tables_whole_its_mount_points_and_its_handles)
{
    EXPECT_EQ(tree_dump_of(nullptr), "Tree p_tree((nil))\n");
    places             p;
    rg_opaque_handle_t table = p.create("/t", {{1, 10}});
    const std::string  dump  = tree_dump_of(static_cast<rg_i_tree_t *>(static_cast<rg_opaque_handle_t>(p.tree)));
    char               first[64];
    std::snprintf(first, sizeof first, "Tree p_tree(%p)\n", static_cast<rg_opaque_handle_t>(p.tree));
    EXPECT_EQ(dump.rfind(first, 0), 0u);
    EXPECT_EQ(masked(dump),
              "Tree p_tree(@)\n  p_tables(@)\n" + masked(dump_of(table, RG_I_DUMP_ALL)) +
                  "  p_unnamed_tables((nil))\n  p_mount_points(@)\n    p_name(/r/)\n    p_filesystem_path(" +
                  p.dir.path() +
                  ")\n  p_to_table_string_conversion_handle(@)\n  p_from_table_string_conversion_handle(@)\n");
    EXPECT_EQ(rg_close_table_1(table), 0);
}

} // namespace kt_test
