// SPDX-License-Identifier: MIT
// table_file_fuzz: any bytes as a table file: opened, read in full, changed, committed, and opened again.
//
// The file lies in memory. An input whose length is odd is opened with a hash table. What must hold besides the
// sanitizers' rules: an open that fails says so with one of the documented codes, and leaves no descriptor; a file that
// opened still opens after a transaction of ours.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "rg_i_table.h"

extern "C" size_t LLVMFuzzerMutate(std::uint8_t * p_data, size_t size, size_t maximum_size);

namespace
{

// Survives NDEBUG: this is what the fuzzer looks for.
void require(bool condition)
{
    if (!condition)
        std::abort();
}

// The worked example of docs/FILE-FORMAT.md, ahead of its deletion, where an input begins that is too short for a
// table.
constexpr std::uint8_t example[] = {
    0x5b, 0,   0, 0,    0, 0,    0, 0,    1,    0,    0,    0,    0,    0,    0,    0,    0, 0,    0,   0,   2, 0,
    0,    0,   0, 0,    0, 0,    0, 0,    0,    0,    3,    0,    0,    0,    3,    0,    0, 0,    0,   0,   0, 0,
    0,    0,   0, 0,    0, 0,    0, 0,    0,    0,    0,    0,    3,    0,    0,    0,    4, 0,    0,   0,   2, 0,
    0,    0,   0, 0,    0, 0,    0, 0,    0,    0,    0,    0,    0,    0,    0,    0,    0, 0,    'i', 'd', 0, 'v',
    'a',  'l', 0, 0x18, 0, 0,    0, 0,    0,    0,    0,    0,    0,    0,    0,    8,    0, 0,    0,   1,   0, 0,
    0,    0,   0, 0,    0, 0x20, 0, 0,    0,    0,    0,    0,    0,    2,    0,    0,    0, 0,    0,   0,   0, 7,
    0,    0,   0, 0,    0, 0,    0, 0xfe, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0x18, 0, 0,    0,   0,   0, 0,
    0,    0,   0, 0,    0, 8,    0, 0,    0,    2,    0,    0,    0,    0,    0,    0,    0, 0x20, 0,   0,   0, 0,
    0,    0,   0, 2,    0, 0,    0, 0x73, 0,    0,    0,    7,    0,    0,    0,    0,    0, 0,    0,   5,   0, 0,
    0,    0,   0, 0,    0, 0x14, 0, 0,    0,    0,    0,    0,    0,    3,    0,    0,    0, 1,    0,   0,   0, 0xab,
    0,    0,   0, 0x24, 0, 0,    0, 0,    0,    0,    0,    0xff, 0xff, 0xff, 0xff, 0x14, 0, 0,    0,   3,   0, 0,
    0,    0,   0, 0,    0, 1,    0, 0,    0,    0,    0,    0,    0,    0,    0,    0,    0};

kt_uint32_t bucket_of(void * p_key)
{
    return *static_cast<const unsigned char *>(p_key) % 16u;
}

kt_int32_t compare_keys(void * p_key1, void * p_key2)
{
    return *static_cast<const unsigned char *>(p_key1) == *static_cast<const unsigned char *>(p_key2) ? 0 : 1;
}

void release(kt_data_type_t type, const kt_value_t & value)
{
    if (rg_i_type_is_indirect(type))
        std::free(value.ptr_char);
}

// Every field of every row, and each row by its key.
void read_all(rg_i_table_t * p_table)
{
    for (kt_uint32_t row = 0; row < p_table->total_applied_rows; ++row)
        for (kt_uint32_t column = 0; column < p_table->total_columns; ++column) {
            kt_char_ptr_t        p_name = p_table->p_columns[column].name;
            const kt_data_type_t type   = p_table->p_columns[rg_i_find_column(p_table, p_name)].type;
            kt_value_t           value;
            if (rg_i_get_value_for_packed_index(p_table, row, p_name, &value, 0, nullptr) != 0)
                continue;
            if (column == 0) {
                kt_uint32_t fixed = 0;
                (void)rg_i_get_fixed_row_index_for_key(p_table, value, &fixed);
            }
            release(type, value);
        }
    kt_binary_t * p_binary = nullptr;
    if (rg_i_get_application_metadata_element_binary(p_table->p_application_metadata, 0, 0, &p_binary) == 0)
        std::free(p_binary);
}

// Whether setting column 1 would set the key too: a damaged file may give them one name, or the key a default that
// counts when it isn't named. Nobody checks whether a key that is set exists already, so that the table might not open.
bool goes_with_the_key(const rg_i_table_t * p_table)
{
    return rg_i_find_column(p_table, p_table->p_columns[1].name) == 0 ||
           (p_table->p_columns[0].qualifier & RG_SET_TO_DEFAULT_WHEN_UNSPECIFIED) != 0;
}

// Adds a row, changes one and deletes one, as far as the table lets us.
void change(rg_i_table_t * p_table)
{
    kt_char_ptr_t p_key_name = p_table->p_columns[0].name;
    kt_value_t    key;
    std::memset(&key, 0, sizeof key);
    kt_value_t * p_key = &key;
    (void)rg_i_add_row(p_table, &p_key_name, &p_key, 1);
    if (p_table->total_columns > 1 && !goes_with_the_key(p_table))
        (void)rg_i_set_value_for_packed_index(p_table, 0, p_table->p_columns[1].name, &key);
    if (p_table->total_applied_rows > 1)
        (void)rg_i_delete_row(p_table, &p_table->p_rows_fixed_index[p_table->p_rows_packed_index[1]]);
}

kt_int32_t open_table(const std::string & path, kt_int32_t mode, bool hashed, rg_i_table_t ** p_p_table)
{
    rg_hash_table_t * p_hash_table = nullptr;
    if (hashed)
        require(rg_i_hash_table_open(16, bucket_of, compare_keys, &p_hash_table) == 0);
    return rg_i_open_persistent_table(nullptr, nullptr, const_cast<kt_char_ptr_t>(path.c_str()), mode, 512,
                                      p_hash_table, p_p_table);
}

bool is_documented(kt_int32_t code)
{
    constexpr kt_int32_t codes[] = {RG_E_TABLE_UNREADABLE, RG_E_BAD_REPLACES_OFFSET, RG_E_BAD_DELETED_ROW_OFFSET,
                                    RG_E_NO_COMMIT_RECORD, RG_E_DUPLICATE_KEY,       RG_E_NO_MEMORY};
    return std::find(std::begin(codes), std::end(codes), code) != std::end(codes);
}

} // namespace

extern "C" size_t LLVMFuzzerCustomMutator(std::uint8_t * p_data, size_t size, size_t maximum_size, unsigned)
{
    if (size < 91 && maximum_size >= sizeof example) {
        std::memcpy(p_data, example, sizeof example);
        size = sizeof example;
    }
    return LLVMFuzzerMutate(p_data, size, maximum_size);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t * p_data, size_t size)
{
    const bool hashed = size % 2 != 0;
    const int  fd     = memfd_create("table", MFD_CLOEXEC);
    require(fd >= 0 && write(fd, p_data, size) == static_cast<ssize_t>(size));
    const std::string path = "/proc/self/fd/" + std::to_string(fd);

    rg_i_table_t *   p_table = nullptr;
    const kt_int32_t rc      = open_table(path, RG_MODE_WRITE | RG_MODE_EXPLICIT_CONTROL, hashed, &p_table);
    if (rc != 0) {
        require(p_table == nullptr && is_documented(rc));
    } else {
        read_all(p_table);
        change(p_table);
        read_all(p_table);
        require(rg_i_apply(p_table, 0, 0) == 0 && rg_i_commit(p_table) == 0);
        read_all(p_table);
        rg_i_close_table(p_table);
        require(open_table(path, RG_MODE_READ, hashed, &p_table) == 0);
        read_all(p_table);
        rg_i_close_table(p_table);
    }
    close(fd);
    // The lowest free descriptor is the same again: nothing was left open.
    const int again = open("/dev/null", O_RDONLY);
    require(again == fd);
    close(again);
    return 0;
}
