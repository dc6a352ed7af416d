// SPDX-License-Identifier: MIT
// The worked example of docs/PACKED-FORMAT.md, read out of the document, made again, and read back; and small buffers
// that machines of both byte orders have packed.
#include <gtest/gtest.h>

#include <filesystem>
#include <sstream>

#include "protocol/hostile_kit.h"

using namespace kt_test;

namespace
{

std::string file_beside(const std::filesystem::path & path)
{
    const bytes raw = read_file(path.string());
    return {raw.begin(), raw.end()};
}

const std::filesystem::path here = std::filesystem::path(KT_SOURCE_DIR) / "tests" / "protocol";

// The bytes of a dump: on each line an offset, pairs of digits, and behind two spaces a note; # opens a heading.
octets bytes_of_dump(const std::string & dump)
{
    octets             content;
    std::istringstream lines(dump);
    for (std::string line; std::getline(lines, line);) {
        if (line.empty() || line[0] == '#')
            continue;
        EXPECT_EQ(std::stoul(line.substr(0, 5)), content.size()) << line;
        const bytes part = from_hex(line.substr(7, line.find("  ", 7) - 7));
        content.insert(content.end(), part.begin(), part.end());
    }
    return content;
}

octets documented_buffer()
{
    const std::string all   = file_beside(here.parent_path().parent_path() / "docs" / "PACKED-FORMAT.md");
    const std::string fence = "```hexdump\n";
    const size_t      begin = all.find(fence);
    EXPECT_NE(begin, std::string::npos);
    const size_t start = begin + fence.size();
    return bytes_of_dump(all.substr(start, all.find("```", start) - start));
}

const table_model example = {
    "t", {{"id", KT_UINT32, {}, RG_PRIMARY_KEY}, {"val", KT_CHAR_PTR, {}}}, {{a_number(KT_UINT32, 7), a_string("ab")}}};

rg_opaque_handle_t example_table(rg_opaque_handle_t tree)
{
    const rg_opaque_handle_t table = create_table(
        tree, "t", {column("id", KT_UINT32, RG_PRIMARY_KEY), column("val", KT_CHAR_PTR, RG_STANDARD, null_value())},
        RG_MODE_WRITE);
    EXPECT_EQ(add_row(table, {{"id", uint32(7)}, {"val", string("ab")}}), 0);
    return table;
}

} // namespace

TEST(the_worked_example_of_a_buffer, is_packed_byte_for_byte)
{
    if constexpr (std::endian::native == std::endian::big)
        GTEST_SKIP() << "the document shows a little-endian machine's";
    ASSERT_EQ(documented_buffer().size(), 467u);
    open_tree tree;
    octets    buffer = packed({{example_table(tree)}});
    clear_row_words(buffer);
    EXPECT_EQ(to_hex(buffer), to_hex(documented_buffer()));
}

TEST(the_worked_example_of_a_buffer, unpacks_into_its_table)
{
    octets buffer = documented_buffer();
    ASSERT_EQ(rg_convert_packed_table_buffer_1(buffer.data(), 0, 0), 0);
    kt_char_ptr_t p_name = nullptr;
    ASSERT_EQ(rg_get_packed_table_name_1(buffer.data(), 0, &p_name), 0);
    EXPECT_STREQ(p_name, "t");
    open_tree tree;
    expect_rows(unpacked(buffer, tree), example);
}

TEST(the_worked_example_of_a_buffer, finds_its_row_as_the_document_says)
{
    const octets buffer = documented_buffer();
    EXPECT_EQ(item_start(buffer, 0, item::rows), 404u);
    EXPECT_EQ(row_start(buffer, 0, 0), 420u);
    EXPECT_EQ(word_at(buffer, 420), 43u);
}

// ---- Buffers that machines have packed ----
//
// Made by tests/foreign/run.sh --golden: the same table, packed on a machine of each byte order.

namespace
{

octets golden_buffer(const std::string & name)
{
    const std::string all = file_beside(here / "golden" / name);
    EXPECT_EQ(all.size(), 4957u) << name;
    return {all.begin(), all.end()};
}

void expect_unpacks(octets buffer)
{
    ASSERT_EQ(rg_convert_packed_table_buffer_1(buffer.data(), 0, 0), 0) << error_text();
    open_tree tree;
    expect_rows(unpacked(buffer, tree), table_of_everything());
}

} // namespace

TEST(a_golden_buffer, of_a_little_endian_machine_unpacks)
{
    expect_unpacks(golden_buffer("little_endian.packed"));
}

TEST(a_golden_buffer, of_a_big_endian_machine_unpacks)
{
    expect_unpacks(golden_buffer("big_endian.packed"));
}

TEST(a_golden_buffer, of_this_byte_order_is_what_packing_gives_today)
{
    octets buffer =
        golden_buffer(std::endian::native == std::endian::big ? "big_endian.packed" : "little_endian.packed");
    clear_row_words(buffer);
    EXPECT_EQ(to_hex(buffer),
              to_hex(buffer_of({packed_form(table_of_everything(), machine::here, {}, 3)}, machine::here)));
}
