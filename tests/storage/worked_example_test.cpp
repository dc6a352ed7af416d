// SPDX-License-Identifier: MIT
// The worked example of docs/FILE-FORMAT.md, read out of the document and made again, step by step.
#include "storage/table_files.h"

using namespace kt_test;

namespace
{

// The bytes of the document's dump, without the offsets ahead of each line.
bytes documented_file()
{
    const std::filesystem::path document = std::filesystem::path(KT_SOURCE_DIR) / "docs" / "FILE-FORMAT.md";
    const bytes                 raw      = read_file(document.string());
    const std::string           all(raw.begin(), raw.end());
    const std::string           fence = "```hexdump\n";
    const size_t                begin = all.find(fence);
    EXPECT_NE(begin, std::string::npos);
    std::string digits;
    for (size_t at = begin + fence.size(); all.compare(at, 3, "```") != 0;) {
        const size_t end = all.find('\n', at);
        digits += all.substr(at + 6, end - at - 6);
        at = end + 1;
    }
    return from_hex(digits);
}

// The file as it was when it had this length, and its last commit record was live.
bytes documented_step(size_t length, std::uint32_t type_of_last_commit)
{
    bytes content = documented_file();
    content.resize(length);
    return file_image(content).at(type_of_last_commit, 0xFFFFFFFF).content();
}

struct the_worked_example : testing::Test {
    registry_at r;
};

} // namespace

TEST_F(the_worked_example, is_made_byte_for_byte_step_by_step)
{
    ASSERT_EQ(documented_file().size(), 271u);
    rg_opaque_handle_t table = r.create();
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_step(115, 99)));
    ASSERT_EQ(add(table, 7, -2), 0);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_step(171, 155)));
    ASSERT_EQ(set(table, 7, 5), 0);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_step(227, 211)));
    ASSERT_EQ(remove(table, 7), 0);
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_file()));
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(the_worked_example, is_made_the_same_when_the_table_is_opened_anew_for_each_step)
{
    EXPECT_EQ(rg_close_table_1(r.create()), 0);
    const auto step = [&](auto change) {
        rg_opaque_handle_t table = r.open(RG_MODE_WRITE);
        EXPECT_EQ(change(table), 0);
        EXPECT_EQ(rg_close_table_1(table), 0);
    };
    step([](auto table) { return add(table, 7, -2); });
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_step(171, 155)));
    step([](auto table) { return set(table, 7, 5); });
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_step(227, 211)));
    step([](auto table) { return remove(table, 7); });
    EXPECT_EQ(to_hex(read_file(r.path)), to_hex(documented_file()));
}

TEST_F(the_worked_example, reads_as_what_was_written_at_each_step)
{
    EXPECT_EQ(state_of_bytes(documented_step(115, 99)), (file_state{0, 1, {}}));
    EXPECT_EQ(state_of_bytes(documented_step(171, 155)), (file_state{0, 2, {{7, -2}}}));
    EXPECT_EQ(state_of_bytes(documented_step(227, 211)), (file_state{0, 3, {{7, 5}}}));
    EXPECT_EQ(state_of_bytes(documented_file()), (file_state{0, 4, {}}));
}
