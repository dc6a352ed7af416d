// SPDX-License-Identifier: MIT
// packed_buffer_fuzz: any bytes as a packed buffer, through everything that a receiver does with one: converted, looked
// into, unpacked, and every value of every row read. What unpacks is packed again, and that must unpack too.
//
// The first byte of the input is a byte of choices, the rest the buffer. It is given to the library in a block of
// exactly the length that its header tells. Start with the seeds: packed_buffer_fuzz CORPUS ../fuzz/seeds/packed_buffer
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "rg_i_table.h"

namespace
{

// Survives NDEBUG: this is what the fuzzer looks for.
void require(bool condition)
{
    if (!condition)
        std::abort();
}

kt_int32_t required(kt_int32_t rc, bool allowed)
{
    require(rc == 0 || allowed);
    ku_error_record_t record;
    ku_get_error_record_1(&record);
    require(record.code == rc || rc == RG_E_INTERNAL);
    return rc;
}

kt_uint32_t hash_first_byte(void * p_key)
{
    return *static_cast<std::uint8_t *>(p_key);
}

kt_int32_t compare_first_byte(void * p_key1, void * p_key2)
{
    return *static_cast<std::uint8_t *>(p_key1) - *static_cast<std::uint8_t *>(p_key2);
}

bool is_number(kt_data_type_t type)
{
    return !rg_i_type_is_indirect(type);
}

void read_rows(rg_opaque_handle_t handle)
{
    const rg_i_table_t & table = *static_cast<rg_i_table_t *>(handle);
    for (kt_uint32_t row = 0; row < table.total_committed_rows; ++row)
        for (kt_uint32_t c = 0; c < table.total_columns; ++c) {
            kt_value_t       value;
            const auto       row_index = static_cast<kt_int32_t>(row);
            const kt_int32_t rc        = rg_get_field_by_index_1(handle, row_index, table.p_columns[c].name, &value);
            if (required(rc, rc == RG_E_LIBRARY_CALL) != 0)
                continue;
            kt_uint32_t found = 0;
            if (c == 0) {
                const kt_int32_t find_rc = rg_get_fixed_row_index_for_key_1(handle, value, &found);
                required(find_rc, find_rc == RG_E_NO_SUCH_KEY);
                require(find_rc != 0 || found < table.maximum_rows);
            }
            if (!is_number(table.p_columns[c].type))
                std::free(value.ptr_char);
        }
}

void pack_again(rg_opaque_handle_t handle)
{
    kt_uint32_t      zero     = 0;
    void *           p_buffer = nullptr;
    const kt_int32_t rc       = rg_pack_tables_1(1, &handle, &zero, &zero, nullptr, &p_buffer);
    // A definition with short names can't be walked.
    if (required(rc, rc == RG_E_INTERNAL) != 0)
        return;
    rg_opaque_handle_t tree = nullptr, again = nullptr;
    require(rg_open_tree_1(&tree, 0, 0) == 0);
    require(rg_unpack_table_1(p_buffer, 256, hash_first_byte, compare_first_byte, tree, 0, &again) == 0 ||
            static_cast<rg_i_table_t *>(handle)->p_rows_hash_table == nullptr);
    require(rg_close_tree_1(tree) == 0);
    std::free(p_buffer);
}

void use(std::uint8_t * p_buffer, kt_uint32_t index, bool hashed)
{
    kt_uint32_t length = 0;
    std::memcpy(&length, p_buffer, sizeof length);
    kt_char_ptr_t p_name = nullptr;
    kt_int32_t    rc     = rg_get_packed_table_name_1(p_buffer, index, &p_name);
    if (required(rc, rc == RG_E_LIBRARY_CALL || rc == RG_E_NO_SUCH_INDEX) == 0)
        require(std::strlen(p_name) < length);

    rg_opaque_handle_t tree = nullptr, handle = nullptr;
    require(rg_open_tree_1(&tree, 0, 0) == 0);
    rc = rg_unpack_table_1(p_buffer, hashed ? 256 : 0, hash_first_byte, compare_first_byte, tree, index, &handle);
    required(rc, rc != RG_E_SYSTEM_CALL && rc != RG_E_NO_MEMORY && rc != RG_E_NULL_POINTER);
    if (rc == 0) {
        read_rows(handle);
        pack_again(handle);
    }
    require(rg_close_tree_1(tree) == 0);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t * p_data, std::size_t size)
{
    if (size < 9)
        return 0;
    const std::uint8_t choices  = *p_data++;
    const auto         length   = static_cast<kt_uint32_t>(size - 1);
    const bool         foreign  = (choices & 1) != 0;
    auto               p_block  = std::make_unique<std::uint8_t[]>(length);
    std::uint8_t *     p_buffer = p_block.get();
    std::memcpy(p_buffer, p_data, length);

    // A header that tells more than there is can't be caught, so it never does.
    const kt_uint32_t told = (choices & 2) != 0 ? rg_i_load_u32(p_buffer) % (length + 1) : length;
    rg_i_store_u32(p_buffer, foreign ? __builtin_bswap32(told) : told);
    p_buffer[4] = 0;
    p_buffer[5] = foreign ? 3 : 2;

    const kt_int32_t rc = rg_convert_packed_table_buffer_1(p_buffer, 0, 0);
    if (required(rc, rc == RG_E_LIBRARY_CALL) != 0 && (choices & 4) != 0)
        return 0; // but for a time a half converted buffer is as good as any
    if (rg_i_load_u32(p_buffer) > length)
        return 0; // a header that was refused, still in the sender's order
    kt_uint32_t      total    = 0;
    const kt_int32_t total_rc = rg_get_total_packed_tables_1(p_buffer, &total);
    if (required(total_rc, total_rc == RG_E_LIBRARY_CALL) != 0)
        return 0;
    for (kt_uint32_t index = 0; index < std::min(total, 4u); ++index)
        use(p_buffer, index, (choices & 8) != 0);
    use(p_buffer, total, false);
    use(p_buffer, 0xFFFFFFFF, false);
    return 0;
}
