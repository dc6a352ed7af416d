// SPDX-License-Identifier: MIT
// hostile_kit: buffers that are not what they should be, and everything that a receiver would do with them.
#pragma once

#include "protocol/packed_kit.h"
#include "support/faults.h"

namespace kt_test
{

// A block of exactly so many bytes, so that sanitizers see a step beyond them.
class exact_block
{
  public:
    explicit exact_block(const octets & content) : p_(std::make_unique<std::uint8_t[]>(content.size()))
    {
        std::copy(content.begin(), content.end(), p_.get());
    }
    std::uint8_t * data() { return p_.get(); }

  private:
    std::unique_ptr<std::uint8_t[]> p_;
};

inline void expect_library_error(const std::string & operation, kt_int32_t result)
{
    EXPECT_EQ(error_code(), RG_E_LIBRARY_CALL);
    const std::string expected =
        "The " + operation + " library function unexpectedly returned " + std::to_string(result);
    EXPECT_NE(error_text().find(expected), std::string::npos) << error_text();
}

// The table at the index as a table of the tree, or NULL with *p_rc set.
inline rg_opaque_handle_t unpacked(octets & buffer, rg_opaque_handle_t tree, kt_uint32_t index = 0,
                                   kt_int32_t * p_rc = nullptr)
{
    exact_block        block(buffer); // gone when the call returns
    rg_opaque_handle_t handle = nullptr;
    const kt_int32_t   rc     = rg_unpack_table_1(block.data(), 0, nullptr, nullptr, tree, index, &handle);
    if (p_rc != nullptr)
        *p_rc = rc;
    else
        EXPECT_EQ(rc, 0) << error_text();
    EXPECT_EQ(handle == nullptr, rc != 0);
    return handle;
}

// Reads every field of every row by every address; what it delivers doesn't matter.
inline void read_everything(rg_opaque_handle_t handle)
{
    const rg_i_table_t & table = object_of(handle);
    for (kt_uint32_t row = 0; row < table.total_committed_rows; ++row)
        for (kt_uint32_t c = 0; c < table.total_columns; ++c) {
            const reading r = read_packed(handle, row, table.p_columns[c].name, 0);
            ASSERT_TRUE(r.rc == 0 || r.rc == RG_E_LIBRARY_CALL) << r.rc;
            if (r.rc != 0 || is_number(table.p_columns[c].type))
                continue;
            if (c == 0)
                find_key(handle, r.value);
            std::free(r.value.ptr_char);
        }
}

// Converts, looks into, unpacks and reads a buffer whose header's length is its own at most.
inline void use_hostile_buffer(const octets & buffer)
{
    exact_block block(buffer);
    if (rg_convert_packed_table_buffer_1(block.data(), 0, 0) != 0) {
        ASSERT_EQ(error_code(), RG_E_LIBRARY_CALL);
        return;
    }
    kt_uint32_t length = 0, total = 0;
    std::memcpy(&length, block.data(), 4);
    if (length > buffer.size())
        return; // a header that lies about its own length can't be caught
    if (rg_get_total_packed_tables_1(block.data(), &total) != 0)
        return;
    open_tree tree;
    for (kt_uint32_t index : {0u, 1u, total, 0xFFFFFFFFu}) {
        kt_char_ptr_t      p_name = nullptr;
        rg_opaque_handle_t table  = nullptr;
        if (rg_get_packed_table_name_1(block.data(), index, &p_name) == 0) {
            ASSERT_LE(std::strlen(p_name), length);
        }
        if (rg_unpack_table_1(block.data(), 0, nullptr, nullptr, tree, index, &table) == 0)
            read_everything(table);
    }
}

// Calls with the buffer's bytes changed one at a time, to 0, to 0xFF and to their complement.
template <class Use> void change_each_byte(const octets & original, Use use)
{
    for (size_t at = 0; at < original.size(); ++at)
        for (const int change : {0, 1, 2}) {
            octets             buffer  = original;
            const std::uint8_t changed = change == 0   ? 0
                                         : change == 1 ? 0xFF
                                                       : static_cast<std::uint8_t>(~original[at]);
            if (changed == original[at] || at < 4) // the length has a test of its own
                continue;
            buffer[at] = changed;
            SCOPED_TRACE("byte " + std::to_string(at) + " is " + std::to_string(changed));
            use(buffer);
        }
}

} // namespace kt_test
