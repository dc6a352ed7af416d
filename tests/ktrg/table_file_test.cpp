// SPDX-License-Identifier: MIT
// table_file: the tool's own reader of table files, on sound ones and on all sorts of others.
#include <cstdio>
#include <functional>

#include "failure.h"
#include "program.h"
#include "table_file.h"

using ktrg_test::scratch;

namespace
{

// The worked example of docs/FILE-FORMAT.md: a table of id and val, one row added, updated and deleted.
const std::vector<std::uint8_t> & example()
{
    static const std::vector<std::uint8_t> bytes = [] {
        const std::string         hex = "5b000000000000000100000000000000 00000000020000000000000000000000"
                                        "03000000030000000000000000000000 00000000000000000300000004000000"
                                        "02000000000000000000000000000000 00000000696400 76616c00 1800000000"
                                        "000000000000000800000001000000 0000000020000000000000000200000000"
                                        "00000007000000 00000000fefffffffff fffff"
                                        "1800000000000000000000000800000002 00000000000000"
                                        "20000000000000000200000073000000 0700000000000000 0500000000000000"
                                        "1800000000000000000000000800000003 00000000000000"
                                        "14000000000000000300000001000000ab000000"
                                        "1800000000000000ffffffff080000000400000000000000";
        std::vector<std::uint8_t> result;
        std::string               digits;
        for (const char c : hex)
            if (c != ' ')
                digits += c;
        for (std::size_t i = 0; i + 1 < digits.size(); i += 2)
            result.push_back(static_cast<std::uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
        return result;
    }();
    return bytes;
}

// The example as it was so many bytes long, with its last commit record live.
std::vector<std::uint8_t> example_of(std::size_t length)
{
    std::vector<std::uint8_t> bytes(example().begin(), example().begin() + static_cast<std::ptrdiff_t>(length));
    for (std::size_t i = length - 16; i < length - 12; i++)
        bytes[i] = 0xFF;
    return bytes;
}

void write_bytes(const scratch & at, const std::vector<std::uint8_t> & bytes)
{
    at.write("t", std::string(bytes.begin(), bytes.end()));
}

ktrg::table_file read(const scratch & at)
{
    return ktrg::read_table_file(at.file("t"), "t");
}

void expect_sum(const ktrg::table_file & file)
{
    EXPECT_EQ(file.bytes.live() + file.bytes.superseded() + file.bytes.dead(), file.length);
}

TEST(reading_a_table_file, the_worked_example_step_by_step)
{
    scratch at;
    ASSERT_EQ(example().size(), 271U);

    write_bytes(at, example_of(115));
    ktrg::table_file file = read(at);
    EXPECT_EQ(file.columns.size(), 2U);
    EXPECT_EQ(ktrg::column_text(file.columns[0]), "id:uint32:key");
    EXPECT_EQ(ktrg::column_text(file.columns[1]), "val:int64");
    EXPECT_EQ(file.rows, 0U);
    EXPECT_EQ(file.counter, 1U);
    EXPECT_EQ(file.transactions, 1U);

    write_bytes(at, example_of(171));
    file = read(at);
    EXPECT_EQ(file.rows, 1U);
    EXPECT_EQ(file.counter, 2U);
    EXPECT_EQ(file.bytes.live_rows, 32U);
    EXPECT_EQ(file.bytes.superseded_commits, 24U);

    write_bytes(at, example_of(227));
    file = read(at);
    EXPECT_EQ(file.rows, 1U);
    EXPECT_EQ(file.updates, 1U);
    EXPECT_EQ(file.bytes.live_rows, 32U);
    EXPECT_EQ(file.bytes.superseded_rows, 32U);

    write_bytes(at, example());
    file = read(at);
    EXPECT_EQ(file.rows, 0U);
    EXPECT_EQ(file.deletions, 1U);
    EXPECT_EQ(file.counter, 4U);
    EXPECT_EQ(file.bytes.deleted_rows, 32U);
    EXPECT_EQ(file.bytes.deletion_lists, 20U);
    expect_sum(file);
}

TEST(reading_a_table_file, bytes_behind_the_live_commit_record_are_dead)
{
    scratch                   at;
    std::vector<std::uint8_t> bytes = example_of(115);
    bytes.resize(500, 0xAB);
    write_bytes(at, bytes);
    const ktrg::table_file file = read(at);
    EXPECT_EQ(file.bytes.behind_commit, 385U);
    EXPECT_EQ(file.counter, 1U);
    expect_sum(file);
}

TEST(reading_a_table_file, every_shorter_length_is_refused_as_damaged)
{
    scratch at;
    for (std::size_t length = 0; length < example().size(); length++) {
        write_bytes(at, {example().begin(), example().begin() + static_cast<std::ptrdiff_t>(length)});
        try {
            (void)read(at);
            ADD_FAILURE() << "a file of " << length << " bytes was accepted";
        } catch (const ktrg::failure & what) {
            EXPECT_EQ(what.exit(), ktrg::exit_code::damaged) << length;
        }
    }
}

TEST(reading_a_table_file, any_changed_byte_is_read_or_refused_and_the_sum_is_right)
{
    scratch     at;
    std::size_t refused = 0;
    for (std::size_t i = 0; i < example().size(); i++) {
        for (const int change : {0x00, 0xFF, 0x100}) {
            std::vector<std::uint8_t> bytes = example();
            bytes[i] = change == 0x100 ? static_cast<std::uint8_t>(~bytes[i]) : static_cast<std::uint8_t>(change);
            write_bytes(at, bytes);
            try {
                expect_sum(read(at));
            } catch (const ktrg::failure & what) {
                EXPECT_EQ(what.exit(), ktrg::exit_code::damaged) << i;
                refused++;
            }
        }
    }
    EXPECT_GT(refused, 0U);
}

TEST(reading_a_table_file, what_replaces_or_deletes_a_row_that_is_not_there_has_its_code)
{
    scratch                   at;
    std::vector<std::uint8_t> bytes = example();
    bytes[183]                      = 0x74;
    write_bytes(at, bytes);
    try {
        (void)read(at);
        ADD_FAILURE();
    } catch (const ktrg::failure & what) {
        EXPECT_EQ(what.code(), RG_E_BAD_REPLACES_OFFSET);
    }
    bytes      = example();
    bytes[243] = 0xac;
    write_bytes(at, bytes);
    try {
        (void)read(at);
        ADD_FAILURE();
    } catch (const ktrg::failure & what) {
        EXPECT_EQ(what.code(), RG_E_BAD_DELETED_ROW_OFFSET);
    }
}

TEST(reading_a_table_file, a_file_that_is_not_there_or_not_a_file_is_told)
{
    scratch at;
    try {
        (void)ktrg::read_table_file(at.file("nowhere"), "nowhere");
        ADD_FAILURE();
    } catch (const ktrg::failure & what) {
        EXPECT_EQ(what.exit(), ktrg::exit_code::not_found);
    }
    try {
        (void)ktrg::read_table_file("/dev/null", "null");
        ADD_FAILURE();
    } catch (const ktrg::failure & what) {
        EXPECT_EQ(what.exit(), ktrg::exit_code::usage);
    }
    EXPECT_FALSE(ktrg::looks_like_table("/dev/null"));
}

} // namespace
