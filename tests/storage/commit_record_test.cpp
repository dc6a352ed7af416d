// SPDX-License-Identifier: MIT
// Commit records: how they are made, and what is refused when they are read.
#include "storage/rg_i_disk_format.h"
#include "storage/table_files.h"

using namespace kt_test;

namespace
{

struct commit_records : testing::Test {
    rg_i_application_metadata_t * p_set = nullptr;

    commit_records() { EXPECT_EQ(rg_i_allocate_application_metadata_buffer(1, &p_set), 0); }
    ~commit_records() override { rg_i_free_application_metadata(p_set); }

    kt_int32_t put(kt_uint32_t type, const std::string & data)
    {
        return rg_i_set_application_metadata(p_set, type, static_cast<kt_uint32_t>(data.size()), text(data));
    }
    bytes made(kt_uint64_t counter)
    {
        kt_uint32_t   length   = 0;
        kt_char_ptr_t p_record = nullptr;
        EXPECT_EQ(rg_i_create_commit_record(p_set, counter, &length, &p_record), 0);
        bytes result(p_record, p_record + length);
        std::free(p_record);
        return result;
    }
    // Reads a record of the file as the open does, with its memory head.
    kt_int32_t read(const bytes & record, kt_uint64_t * p_counter)
    {
        file_image image{bytes{}};
        image.word(static_cast<std::uint32_t>(record.size()) + 8);
        bytes memory = image.content();
        memory.resize(20);
        memory.insert(memory.end(), record.begin() + 12, record.end());
        // In a block of exactly its size, so that a sanitizer sees a read beyond.
        std::vector<char> exact(memory.begin(), memory.end());
        return rg_i_open_commit_record(exact.data(), p_set, p_counter);
    }
    std::string got(kt_uint32_t type)
    {
        kt_uint32_t   length = 0;
        kt_char_ptr_t p_data = nullptr;
        EXPECT_EQ(rg_i_get_application_metadata_element(p_set, type, 0, &length, &p_data), 0);
        std::string result(p_data, length);
        std::free(p_data);
        return result;
    }
};
struct damaged_commit_records : commit_records {
};

} // namespace

TEST_F(commit_records, without_application_metadata_it_is_24_bytes)
{
    EXPECT_EQ(to_hex(made(0x0102030405060708)),
              to_hex(from_hex("18 00 00 00 00 00 00 00 ff ff ff ff 08 00 00 00 08 07 06 05 04 03 02 01")));
}

TEST_F(commit_records, an_element_of_length_0_still_takes_8_bytes)
{
    ASSERT_EQ(put(0, ""), 0);
    EXPECT_EQ(to_hex(made(1)), to_hex(from_hex("24 00 00 00 00 00 00 00 ff ff ff ff 14 00 00 00 01 00 00 00 00 00 00 00"
                                               "01 00 00 00 00 00 00 00 00 00 00 00")));
}

TEST_F(commit_records, elements_stand_in_the_order_of_their_types_and_come_back_committed)
{
    ASSERT_EQ(put(7, "seven"), 0);
    ASSERT_EQ(put(2, "two"), 0);
    const bytes record = made(9);
    EXPECT_EQ(record.size(), 24u + 4 + 8 + 3 + 8 + 5);
    EXPECT_EQ(record[28], 2);

    rg_i_free_application_metadata(p_set);
    ASSERT_EQ(rg_i_allocate_application_metadata_buffer(1, &p_set), 0);
    kt_uint64_t counter = 0;
    EXPECT_EQ(read(record, &counter), 0);
    EXPECT_EQ(counter, 9u);
    EXPECT_EQ(got(2), "two");
    EXPECT_EQ(got(7), "seven");
    EXPECT_EQ(made(9), record);
}

TEST_F(commit_records, the_applied_version_goes_before_the_committed_one_and_a_pending_deletion_is_still_written)
{
    ASSERT_EQ(put(1, "old"), 0);
    ASSERT_EQ(rg_i_commit_application_metadata_buffer_updates(p_set), 0);
    ASSERT_EQ(put(1, "newer"), 0);
    EXPECT_EQ(made(1).size(), 24u + 4 + 8 + 5);
    ASSERT_EQ(rg_i_delete_application_metadata_element(p_set, 1), 0);
    EXPECT_EQ(made(1).size(), 24u + 4 + 8 + 3);
}

TEST_F(commit_records, an_element_with_neither_version_is_left_out)
{
    ASSERT_EQ(put(1, "new"), 0);
    ASSERT_EQ(rg_i_delete_application_metadata_element(p_set, 1), 0);
    EXPECT_EQ(made(1).size(), 24u);
}

TEST_F(commit_records, a_failed_allocation_gives_12)
{
    fault_scope   faults;
    kt_uint32_t   length   = 0;
    kt_char_ptr_t p_record = nullptr;
    fail_call(call::allocation, 1, ENOMEM);
    EXPECT_EQ(rg_i_create_commit_record(p_set, 1, &length, &p_record), RG_E_NO_MEMORY);
    EXPECT_EQ(error_code(), RG_E_NO_MEMORY);
    EXPECT_EQ(p_record, nullptr);
}

TEST_F(commit_records, a_data_length_below_9_means_that_there_are_no_elements)
{
    bytes       record  = from_hex("20 00 00 00 00 00 00 00 ff ff ff ff 08 00 00 00 05 00 00 00 00 00 00 00"
                                          "01 00 00 00 00 00 00 00");
    kt_uint64_t counter = 0;
    EXPECT_EQ(read(record, &counter), 0);
    EXPECT_EQ(counter, 5u);
    EXPECT_EQ(p_set->total_elements, 0u);
}

TEST_F(damaged_commit_records, elements_that_do_not_fit_are_refused_at_every_cut)
{
    ASSERT_EQ(put(1, "one"), 0);
    ASSERT_EQ(put(2, "two"), 0);
    const bytes whole = made(3);
    for (size_t size = 24; size < whole.size(); ++size) {
        rg_i_free_application_metadata(p_set);
        ASSERT_EQ(rg_i_allocate_application_metadata_buffer(1, &p_set), 0);
        kt_uint64_t counter = 0;
        EXPECT_EQ(read(bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)), &counter),
                  RG_E_TABLE_UNREADABLE)
            << size;
        EXPECT_EQ(error_code(), RG_E_TABLE_UNREADABLE);
        EXPECT_EQ(p_set->total_elements, 0u);
    }
}

TEST_F(damaged_commit_records, a_length_that_wraps_is_refused)
{
    ASSERT_EQ(put(1, "one"), 0);
    bytes record = made(3);
    for (const std::uint8_t high : bytes{0x7f, 0x80, 0xff}) {
        record[32] = record[33] = record[34] = 0xff;
        record[35]                           = high;
        kt_uint64_t counter                  = 0;
        EXPECT_EQ(read(record, &counter), RG_E_TABLE_UNREADABLE);
    }
}

TEST_F(damaged_commit_records, a_type_that_stands_twice_gives_108)
{
    bytes       record  = from_hex("2c 00 00 00 00 00 00 00 ff ff ff ff 1c 00 00 00 05 00 00 00 00 00 00 00"
                                          "02 00 00 00 04 00 00 00 00 00 00 00 04 00 00 00 00 00 00 00");
    kt_uint64_t counter = 0;
    EXPECT_EQ(read(record, &counter), RG_E_DUPLICATE_KEY);
}

TEST_F(damaged_commit_records, elements_out_of_order_are_taken_in_order_without_the_cost_of_the_square)
{
    constexpr std::uint32_t count = 200000;
    file_image              image{bytes{}};
    image.word(24 + 4 + 8 * count).word(0).word(0xFFFFFFFF).word(12 + 8 * count).wide(6).word(count);
    for (std::uint32_t i = 0; i < count; ++i)
        image.word(count - i).word(0);
    kt_uint64_t counter = 0;
    EXPECT_EQ(read(image.content(), &counter), 0);
    EXPECT_EQ(p_set->total_elements, count);
    EXPECT_EQ(p_set->p_index[0].type, 1u);
    EXPECT_EQ(p_set->p_index[count - 1].type, count);
}
