// SPDX-License-Identifier: MIT
// rg_i_packed_format: every fixed byte of a packed buffer. docs/PACKED-FORMAT.md tells the rules around them.
//
// A buffer is a message: header, preamble, four slots a table, and behind them the indirect data area with everything
// else. A buffer may lie at any address and comes from anybody: what is read here is read by copying, and bounded by
// the length that the header tells. On the wire: never change a width, an offset or a number.
#pragma once

#include <bit>
#include <cstddef>
#include <cstring>
#include <type_traits>

#include "kt_pmsg.h"
#include "rg_i_record_buffer_pool.h"

// One slot of the preamble: a word, and four bytes that nobody reads.
struct rg_i_packed_word_t {
    kt_uint32_t word;   // bytes 0-3
    kt_uint32_t unused; // bytes 4-7: 0
};

// What stands at the start of a buffer. The table directory follows.
struct rg_i_packed_head_t {
    kt_pmsg_header_t   header;              // bytes 0-7
    rg_i_packed_word_t packed_slot_zero;    // bytes 8-15: 0
    rg_i_packed_word_t packed_slot_one;     // bytes 16-23: 1
    rg_i_packed_word_t packed_slot_length;  // bytes 24-31: the length of the buffer again
    rg_i_packed_word_t packed_total_tables; // bytes 32-39
};

// A table's entry in the directory: four slots with anchors into the indirect data area.
struct rg_i_packed_table_t {
    kt_pmsg_value_t name;            // bytes 0-7: KT_CHAR_PTR
    kt_pmsg_value_t fixed_metadata;  // bytes 8-15: KT_SD_PTR
    kt_pmsg_value_t column_metadata; // bytes 16-23: KT_SD_PTR_ARRAY
    kt_pmsg_value_t rows;            // bytes 24-31: KT_BINARY_PTR_ARRAY
};

static_assert(sizeof(rg_i_packed_head_t) == 40);
static_assert(offsetof(rg_i_packed_head_t, packed_slot_zero) == 8 &&
              offsetof(rg_i_packed_head_t, packed_slot_one) == 16 &&
              offsetof(rg_i_packed_head_t, packed_slot_length) == 24 &&
              offsetof(rg_i_packed_head_t, packed_total_tables) == 32);
static_assert(sizeof(rg_i_packed_table_t) == 32);
static_assert(offsetof(rg_i_packed_table_t, fixed_metadata) == 8 &&
              offsetof(rg_i_packed_table_t, column_metadata) == 16 && offsetof(rg_i_packed_table_t, rows) == 24);
static_assert(std::is_trivially_copyable_v<rg_i_packed_head_t>);

inline constexpr kt_uint32_t RG_I_PACKED_TOTAL_TABLES_OFFSET = offsetof(rg_i_packed_head_t, packed_total_tables);
inline constexpr kt_uint32_t RG_I_PACKED_DIRECTORY_OFFSET    = sizeof(rg_i_packed_head_t);

inline constexpr kt_uint8_t RG_I_PACKED_VERSION    = 0;
inline constexpr kt_uint8_t RG_I_PACKED_PROTO_TYPE = 2;
inline constexpr kt_uint8_t RG_I_PACKED_LOCAL_ARCH_PROPS =
    KT_PMSG_ARCH_64_BIT | (std::endian::native == std::endian::big ? KT_PMSG_ARCH_BIG_ENDIAN : 0);

// Header, preamble and directory. The indirect data area starts behind them.
[[nodiscard]] constexpr kt_uint64_t rg_i_packed_fixed_length(kt_uint32_t total_tables)
{
    return (kt_uint64_t{4} * total_tables + 5) * 8;
}
static_assert(rg_i_packed_fixed_length(0) == sizeof(rg_i_packed_head_t));
static_assert(rg_i_packed_fixed_length(2) == sizeof(rg_i_packed_head_t) + 2 * sizeof(rg_i_packed_table_t));

// Offset of a table's entry in the directory.
// Kept because callers depend on it: the sum is 32 bits wide, as the test of the index is. Index 0xFFFFFFFF, which
// passes that test, names the four slots from byte 8 on.
[[nodiscard]] constexpr kt_uint32_t rg_i_packed_table_offset(kt_uint32_t table_index)
{
    return RG_I_PACKED_DIRECTORY_OFFSET + static_cast<kt_uint32_t>(sizeof(rg_i_packed_table_t)) * table_index;
}
static_assert(rg_i_packed_table_offset(0xFFFFFFFF) == 8);

// Elements of the fixed metadata.
enum rg_i_packed_table_element_t : kt_uint32_t {
    RG_I_PACKED_TABLE_NAME           = 0, // KT_CHAR_PTR: the registry path
    RG_I_PACKED_TABLE_ROWS           = 1, // KT_UINT32
    RG_I_PACKED_TABLE_COLUMNS        = 2, // KT_UINT32
    RG_I_PACKED_TABLE_CHANGE_COUNTER = 3, // KT_UINT64
    RG_I_PACKED_TABLE_PROPERTIES     = 4, // KT_INT32: 0
    RG_I_PACKED_TABLE_ELEMENTS       = 5
};

// Elements of a column's metadata. The last two stand only where the column has a structured data definition.
enum rg_i_packed_column_element_t : kt_uint32_t {
    RG_I_PACKED_COLUMN_NAME              = 0, // KT_CHAR_PTR
    RG_I_PACKED_COLUMN_TYPE              = 1, // KT_UINT32
    RG_I_PACKED_COLUMN_QUALIFIER         = 2, // KT_UINT32
    RG_I_PACKED_COLUMN_PROPERTIES        = 3, // KT_INT32
    RG_I_PACKED_COLUMN_DEFAULT           = 4, // the column's type, or KT_UINT32 0 for structured data
    RG_I_PACKED_COLUMN_FIELDS            = 5, // KT_UINT32
    RG_I_PACKED_COLUMN_FIELD_TYPES       = 6, // KT_UINT32_ARRAY
    RG_I_PACKED_COLUMN_FIELD_NAMES       = 7, // KT_CHAR_PTR_ARRAY
    RG_I_PACKED_COLUMN_ELEMENTS          = 6,
    RG_I_PACKED_COLUMN_ELEMENTS_WITH_DEF = 8
};

// A row item is the image of the row's record, seen as a binary: the record's length word, which counts the head,
// serves as the binary's. Its fields are those of rg_i_record_metadata_t and then the record's data.
static_assert(offsetof(rg_i_record_metadata_t, record_length) == offsetof(kt_binary_t, length));
static_assert(offsetof(rg_i_record_metadata_t, p_next) == 4 && offsetof(rg_i_record_metadata_t, type) == 12 &&
              offsetof(rg_i_record_metadata_t, disk_table_offset) == 16);
static_assert(RG_I_RECORD_HEAD_LENGTH == 20 && RG_I_RECORD_OVERHANG == sizeof(kt_uint32_t));

// A buffer whose header and directory have been found to fit in its length.
struct rg_i_packed_buffer_t {
    kt_char_ptr_t p_buffer;
    kt_uint32_t   total_tables;
    kt_char_ptr_t p_indirect_data;
    kt_uint32_t   indirect_length; // bytes from p_indirect_data to the end that the header tells
};

// Looks at the head of a buffer in local order. False: its length is below its fixed part. Nothing beyond the length is
// read.
[[nodiscard]] inline bool rg_i_look_into_packed_buffer(void * p_buffer, rg_i_packed_buffer_t * p_look)
{
    kt_char_ptr_t const p_bytes = static_cast<kt_char_ptr_t>(p_buffer);
    kt_uint32_t         length  = 0;
    std::memcpy(&length, p_bytes, sizeof length);
    if (length < RG_I_PACKED_DIRECTORY_OFFSET)
        return false;
    kt_uint32_t total_tables = 0;
    std::memcpy(&total_tables, p_bytes + RG_I_PACKED_TOTAL_TABLES_OFFSET, sizeof total_tables);
    const kt_uint64_t fixed_length = rg_i_packed_fixed_length(total_tables);
    if (fixed_length > length)
        return false;
    *p_look = {p_bytes, total_tables, p_bytes + fixed_length, static_cast<kt_uint32_t>(length - fixed_length)};
    return true;
}
