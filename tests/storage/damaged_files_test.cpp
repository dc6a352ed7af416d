// SPDX-License-Identifier: MIT
// Files that no writer made: each opens or is refused with a code, nothing is read outside them, nothing stays behind.
#include <cerrno>

#include "storage/table_files.h"

using namespace kt_test;

namespace
{

// The worked example at each step, with all three kinds of record.
file_image example(unsigned steps = 4)
{
    file_image image;
    image.commit(1, steps > 1 ? 0 : 0xFFFFFFFF);
    if (steps > 1) {
        const std::uint32_t first = image.row(0, 7, -2);
        image.commit(2, steps > 2 ? 0 : 0xFFFFFFFF);
        if (steps > 2) {
            const std::uint32_t second = image.row(first, 7, 5);
            image.commit(3, steps > 3 ? 0 : 0xFFFFFFFF);
            if (steps > 3) {
                image.deleted_rows({second});
                image.commit(4);
            }
        }
    }
    return image;
}

struct damaged_files : testing::Test {
    registry_at r;

    // Opens the bytes for reading and for writing, hashed and not, and reads all there is. The code of the first.
    kt_int32_t look_at(const bytes & content)
    {
        write_file(r.path, content);
        const size_t descriptors = open_descriptors();
        ku_set_no_error_1();
        kt_int32_t         rc    = 0;
        rg_opaque_handle_t table = r.open(RG_MODE_READ, &rc);
        if (table != nullptr)
            read_all(table);
        else
            EXPECT_EQ(error_code(), rc);
        rg_opaque_handle_t hashed = nullptr;
        const kt_int32_t   hashed_rc =
            rg_open_hashed_key_table_1(r.tree, text("/r/t"), RG_MODE_WRITE, 1024, hash_uint32, compare_uint32, &hashed);
        if (hashed_rc == 0)
            read_all(hashed);
        EXPECT_EQ(open_descriptors(), descriptors);
        return rc;
    }
    void read_all(rg_opaque_handle_t table)
    {
        const rg_i_table_t & t = object(table);
        for (kt_uint32_t i = 0; i < t.total_applied_rows; ++i)
            for (kt_uint32_t column = 0; column < t.total_columns; ++column) {
                kt_char_ptr_t        p_name = t.p_columns[column].name;
                const kt_data_type_t type   = t.p_columns[rg_i_find_column(&t, p_name)].type;
                kt_value_t           value;
                if (rg_get_field_by_index_1(table, static_cast<kt_int32_t>(i), p_name, &value) == 0 &&
                    rg_i_type_is_indirect(type))
                    std::free(value.ptr_char);
            }
        EXPECT_EQ(rg_close_table_1(table), 0);
    }
    void expect(const file_image & image, kt_int32_t code) { EXPECT_EQ(look_at(image.content()), code); }
};

} // namespace

TEST_F(damaged_files, of_every_length_of_the_worked_example_give_a_code)
{
    const bytes whole = example().content();
    for (size_t length = 0; length < whole.size(); ++length) {
        const kt_int32_t rc = look_at(bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)));
        EXPECT_TRUE(rc == RG_E_TABLE_UNREADABLE || rc == RG_E_NO_COMMIT_RECORD) << length << ": " << rc;
        EXPECT_EQ(rc == RG_E_TABLE_UNREADABLE, length <= 12 || length >= 259)
            << length << ": the walk leaves the file, or the live commit record is there and cut";
    }
    EXPECT_EQ(look_at(whole), 0);
}

TEST_F(damaged_files, with_any_one_byte_changed_open_or_give_a_code)
{
    for (unsigned steps = 1; steps <= 4; ++steps) {
        const bytes whole = example(steps).content();
        for (size_t at = 0; at < whole.size(); ++at)
            for (const int change : {0, 1, 2, 3}) {
                bytes              content = whole;
                const std::uint8_t byte    = whole[at];
                content[at]                = static_cast<std::uint8_t>(change == 0   ? 0
                                                                       : change == 1 ? 0xFF
                                                                       : change == 2 ? ~byte
                                                                                     : byte ^ 1);
                if (content[at] == byte)
                    continue;
                const kt_int32_t rc = look_at(content);
                EXPECT_TRUE(rc == 0 || rc == RG_E_TABLE_UNREADABLE || rc == RG_E_NO_COMMIT_RECORD ||
                            rc == RG_E_BAD_REPLACES_OFFSET || rc == RG_E_BAD_DELETED_ROW_OFFSET || rc == RG_E_NO_MEMORY)
                    << "step " << steps << " byte " << at << " change " << change << ": " << rc;
            }
    }
}

TEST_F(damaged_files, with_any_one_bit_changed_in_columns_of_every_type_open_or_give_a_code)
{
    std::vector<rg_column_t> columns    = {column("key", KT_CHAR_PTR, RG_PRIMARY_KEY, string(""))};
    rg_sd_def_t              definition = {1, {{KT_INT32, text("f")}}};
    for (kt_data_type_t type = KT_INT32; type <= KT_SD_PTR_ARRAY; ++type) {
        columns.push_back(column("c" + std::to_string(type), type, RG_STANDARD, null_value()));
        columns.back().sd_defn = &definition;
    }
    rg_opaque_handle_t table = create_table(r.tree, "/r/t", columns, RG_MODE_WRITE);
    ASSERT_EQ(add_row(table, {{"key", string("a key")}, {"c8", string("a text")}}), 0);
    EXPECT_EQ(rg_close_table_1(table), 0);
    const bytes whole = read_file(r.path);
    for (size_t at = 0; at < whole.size(); ++at) {
        bytes content = whole;
        content[at]   = static_cast<std::uint8_t>(content[at] ^ 1 << at % 8);
        look_at(content);
        content[at] = 0xFF;
        look_at(content);
    }
}

TEST_F(damaged_files, of_zeros_or_of_ones_of_any_length_give_a_code)
{
    for (const size_t length : {13u, 28u, 91u, 4096u, 70000u}) {
        EXPECT_EQ(look_at(bytes(length, 0)), RG_E_TABLE_UNREADABLE);
        EXPECT_EQ(look_at(bytes(length, 0xFF)), RG_E_NO_COMMIT_RECORD);
    }
}

TEST_F(damaged_files, with_a_record_length_of_0_or_below_a_head_ahead_of_the_commit_record_give_14)
{
    for (const std::uint32_t length : {0u, 1u, 11u}) {
        expect(example().at(0, length), RG_E_TABLE_UNREADABLE);
        expect(example().at(91, length), RG_E_TABLE_UNREADABLE);
        expect(example().at(115, length), RG_E_TABLE_UNREADABLE);
        expect(example().at(227, length), RG_E_TABLE_UNREADABLE);
    }
}

TEST_F(damaged_files, whose_walk_leaves_them_by_one_long_record_or_by_many_give_215_with_the_text_of_2605_202)
{
    for (const std::uint32_t length : {200u, 271u - 115, 0x7FFFFFFFu, 0xFFFFFFFFu, 0xFFFFFFFFu - 114}) {
        expect(example().at(115, length), RG_E_NO_COMMIT_RECORD);
        EXPECT_EQ(error_message_index(), 19);
        EXPECT_EQ(error_text().rfind("2605-202", 0), 0u);
    }
    file_image many;
    for (int i = 0; i < 1000; ++i)
        many.old_commit(1);
    expect(many, RG_E_NO_COMMIT_RECORD);
    many.row(0, 1, 1);
    expect(many, RG_E_NO_COMMIT_RECORD);
}

TEST_F(damaged_files, with_a_record_of_another_type_give_14)
{
    for (const std::uint32_t type : {1u, 4u, 0xFFFFFFFEu, 0x80000000u})
        expect(example().at(115 + 8, type), RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, with_a_live_commit_record_shorter_than_24_or_longer_than_the_file_give_14)
{
    for (const std::uint32_t length : {0u, 11u, 12u, 23u, 25u, 0xFFFFFFFFu})
        expect(example().at(247, length), RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, with_elements_that_leave_the_commit_record_give_14)
{
    expect(example().at(247 + 12, 9), RG_E_TABLE_UNREADABLE); // says that there are elements
    expect(example().at(247 + 12, 0xFFFFFFFF), RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, with_a_row_shorter_than_its_fixed_part_give_14)
{
    for (const std::uint32_t length : {12u, 16u, 31u}) {
        file_image image;
        image.record(2, bytes(length - 12, 0));
        image.commit(1);
        expect(image, RG_E_TABLE_UNREADABLE);
    }
    file_image image;
    image.record(2, bytes(20, 0));
    image.commit(1);
    expect(image, 0);
}

TEST_F(damaged_files, with_a_count_of_deletions_that_does_not_fit_give_14)
{
    for (const std::uint32_t count : {2u, 0x3FFFFFFFu, 0x40000000u, 0x40000001u, 0xFFFFFFFFu}) {
        file_image          image;
        const std::uint32_t a = image.row(0, 1, 1);
        image.deleted_rows({a}, count);
        image.commit(1);
        expect(image, RG_E_TABLE_UNREADABLE);
    }
    for (const std::uint32_t length : {12u, 15u}) {
        file_image image;
        image.record(3, bytes(length - 12, 0));
        image.commit(1);
        expect(image, RG_E_TABLE_UNREADABLE);
    }
}

TEST_F(damaged_files, with_a_replaces_offset_that_names_no_earlier_row_give_213_with_the_text_of_2605_202)
{
    const file_image good  = example();
    const auto       wrong = {
              1u,    12u,         91u,         114u,       116u, // inside records, the metadata, a commit record
              171u,  203u,        227u,        247u,       271u, // itself, behind it, the end
              4096u, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu};
    for (const std::uint32_t offset : wrong) {
        expect(example().at(171 + 12, offset), RG_E_BAD_REPLACES_OFFSET);
        EXPECT_EQ(error_message_index(), 19);
        EXPECT_EQ(error_text().rfind("2605-202", 0), 0u);
    }
}

TEST_F(damaged_files, with_a_deleted_offset_that_names_no_earlier_row_give_214_with_the_text_of_2605_202)
{
    for (const std::uint32_t offset : {0u, 1u, 91u, 116u, 147u, 227u, 247u, 271u, 0xFFFFFFFFu}) {
        expect(example().at(227 + 16, offset), RG_E_BAD_DELETED_ROW_OFFSET);
        EXPECT_EQ(error_message_index(), 19);
        EXPECT_EQ(error_text().rfind("2605-202", 0), 0u);
    }
}

TEST_F(damaged_files, with_a_deletion_or_a_version_of_a_row_that_comes_later_are_refused)
{
    file_image image;
    image.deleted_rows({91 + 20});
    image.row(0, 1, 1);
    image.commit(1);
    expect(image, RG_E_BAD_DELETED_ROW_OFFSET);
    file_image version;
    version.row(91 + 32, 1, 1);
    version.row(0, 1, 1);
    version.commit(1);
    expect(version, RG_E_BAD_REPLACES_OFFSET);
}

TEST_F(damaged_files, whose_columns_do_not_fit_in_the_metadata_record_give_14)
{
    for (const std::uint32_t total_columns : {0u, 3u, 4u, 0x7FFFFFFFu, 0x92492493u, 0xFFFFFFFFu})
        expect(example().at(20, total_columns), RG_E_TABLE_UNREADABLE);
    // A record that has no room for its own fixed part, and one whose columns have no names.
    file_image short_one{bytes{}};
    short_one.record(1, bytes(15, 0));
    short_one.commit(1);
    expect(short_one, RG_E_TABLE_UNREADABLE);
    file_image nameless{bytes{}};
    nameless.record(1, file_image(bytes{}).word(0).word(0).word(1).word(0).content());
    nameless.commit(1);
    expect(nameless, RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, whose_names_do_not_end_in_the_metadata_record_give_14)
{
    for (const std::uint32_t offset : {7u, 8u, 0x7FFFFFFFu, 0xFFFFFFFFu})
        for (const std::uint32_t column : {28u, 56u})
            expect(example().at(column, offset), RG_E_TABLE_UNREADABLE);
    bytes unterminated = example().content();
    unterminated[90]   = 'x';
    EXPECT_EQ(look_at(unterminated), RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, whose_definitions_do_not_end_in_the_metadata_record_give_14)
{
    for (const std::uint32_t offset : {1u, 4u, 6u, 7u, 0xFFFFFFFFu})
        expect(example().at(56 + 16, offset), RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, whose_default_data_does_not_fit_in_the_metadata_record_give_14)
{
    file_image image = example();
    image.at(56 + 4, KT_CHAR_PTR);
    for (const auto & [offset, length] :
         {std::pair{0u, 8u}, {8u, 0u}, {7u, 1u}, {0xFFFFFFFFu, 1u}, {1u, 0xFFFFFFFFu}}) {
        image.at(56 + 20, offset).at(56 + 24, length);
        expect(image, RG_E_TABLE_UNREADABLE);
    }
    image.at(56 + 20, 0).at(56 + 24, 7);
    expect(image, 0);
}

TEST_F(damaged_files, whose_count_of_variable_length_columns_lies_are_counted)
{
    file_image image = example(2);
    image.at(24, 0xFFFFFFFF);
    write_file(r.path, image.content());
    rg_opaque_handle_t table = r.open(RG_MODE_READ);
    EXPECT_EQ(object(table).total_variable_length_columns, 0u);
    EXPECT_EQ(rg_close_table_1(table), 0);
}

TEST_F(damaged_files, whose_columns_all_name_one_long_name_are_refused_without_reading_it_for_each)
{
    constexpr std::uint32_t columns = 20000, name = 1000000;
    file_image              metadata{bytes{}};
    metadata.word(0).word(0).word(columns).word(0);
    for (std::uint32_t i = 0; i < columns; ++i)
        metadata.word(0).word(KT_INT32).word(RG_STANDARD).word(0).word(0).wide(0);
    bytes payload = metadata.content();
    payload.resize(payload.size() + name, 'x');
    payload.push_back(0);
    file_image image{bytes{}};
    image.record(1, payload);
    image.commit(1);
    expect(image, RG_E_TABLE_UNREADABLE);
}

TEST_F(damaged_files, beyond_what_offsets_can_tell_give_14_without_being_read)
{
    write_file(r.path, example().content());
    std::filesystem::resize_file(r.path, (1ull << 32) + 5);
    fault_scope faults;
    EXPECT_EQ(r.try_open(), RG_E_TABLE_UNREADABLE);
    EXPECT_EQ(calls_made(call::read), 0u);
}

TEST_F(damaged_files, that_free_and_take_slots_in_the_worst_order_open_in_bounded_time)
{
    constexpr std::uint32_t    count = 20000;
    file_image                 image;
    std::vector<std::uint32_t> offsets;
    for (std::uint32_t i = 0; i < count; ++i)
        offsets.push_back(image.row(0, i, i));
    image.deleted_rows({offsets.rbegin(), offsets.rend()});
    for (std::uint32_t i = count; i-- > 0;)
        image.row(offsets[i], i, i);
    image.deleted_rows(std::vector<std::uint32_t>(count, offsets[0]));
    image.commit(1);
    expect(image, 0);
}
