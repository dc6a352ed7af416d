// SPDX-License-Identifier: MIT
// rg_i_disk_format: every record of a table file, byte by byte. docs/FILE-FORMAT.md tells the rules around them.
//
// A file is a run of records without gaps and without alignment: a metadata record, transaction groups, and at the end,
// as far as readers are concerned, the first live commit record. All integers are in the writer's byte order. Records
// lie at any address: copy them in and out with rg_i_load and rg_i_store, never form a pointer to one inside a file's
// bytes. On disk: never change a width, an offset or a number.
#pragma once

#include <cstddef>
#include <cstring>
#include <type_traits>

#include "kt_pmsg.h"
#include "kt_rg.h"

#pragma pack(push, 1)

// The head of every record.
struct rg_i_disk_record_metadata_t {
    kt_uint32_t record_length; // bytes 0-3: length of the record, this head included
    kt_uint32_t next_offset;   // bytes 4-7: written as 0, never used as a link
    kt_uint32_t type;          // bytes 8-11: RG_RECORD_TYPE_...
};

// What stands at the start of the metadata record's data, on disk and in memory alike.
struct rg_i_metadata_head_t {
    kt_uint32_t big_endian_host;               // bytes 0-3: 1 if a big-endian machine made the table; nobody looks
    kt_uint32_t metadata_reserved;             // bytes 4-7: 0
    kt_uint32_t total_columns;                 // bytes 8-11
    kt_uint32_t total_variable_length_columns; // bytes 12-15: columns with indirect data
};

// The fixed part of the metadata record. The columns follow, and behind them the variable data region.
struct rg_i_disk_metadata_record_t {
    rg_i_disk_record_metadata_t record; // bytes 0-11: type 1
    rg_i_metadata_head_t        head;   // bytes 12-27
};

struct rg_disk_column_t {
    kt_uint32_t    name_offset;    // bytes 0-3: of the name, from the start of the variable data region
    kt_data_type_t type;           // bytes 4-7
    rg_qualifier_t qualifier;      // bytes 8-11
    kt_int32_t     properties;     // bytes 12-15
    kt_uint32_t    sd_defn_offset; // bytes 16-19: of the rg_disk_sd_def_t, from the same start; 0: none
    kt_uint8_t     default_value[sizeof(kt_pmsg_value_t)]; // bytes 20-27: value, or anchor into the region
};

// A structured data definition. Its fields follow: each a disk_field_def, whose name ends with its terminator.
struct rg_disk_sd_def_t {
    kt_uint32_t number_of_fields; // bytes 0-3
};

struct disk_field_def {
    kt_data_type_t type;               // bytes 0-3
    kt_char_t      name_char_array[1]; // bytes 4-: the field's name
};

// The fixed part of a row record. The slots follow, one a column, and then the indirect data.
struct rg_i_disk_row_record_t {
    rg_i_disk_record_metadata_t record;          // bytes 0-11: type 2
    kt_uint32_t                 replaces_offset; // bytes 12-15: record of the version that this one replaces; 0: none
};

// The fixed part of a deleted-rows record. The file offsets of the deleted rows' records follow, a u32 each.
struct rg_i_disk_deleted_rows_record_t {
    rg_i_disk_record_metadata_t record; // bytes 0-11: type 3
    kt_uint32_t                 count;  // bytes 12-15
};

// The fixed part of a commit record. With application metadata, a u32 count and the elements follow.
struct rg_i_disk_commit_record_t {
    rg_i_disk_record_metadata_t record;             // bytes 0-11: type 0xFFFFFFFF while live, 0 when superseded
    kt_uint32_t                 commit_data_length; // bytes 12-15: bytes that follow this word
    kt_uint64_t                 change_counter;     // bytes 16-23
};

// The head of an element of application metadata. Its bytes follow.
struct rg_i_disk_application_metadata_element_t {
    kt_uint32_t type;   // bytes 0-3
    kt_uint32_t length; // bytes 4-7: of the bytes behind
};

#pragma pack(pop)

static_assert(sizeof(rg_i_disk_record_metadata_t) == 12);
static_assert(offsetof(rg_i_disk_record_metadata_t, next_offset) == 4 &&
              offsetof(rg_i_disk_record_metadata_t, type) == 8);
static_assert(sizeof(rg_i_metadata_head_t) == 16);
static_assert(offsetof(rg_i_metadata_head_t, metadata_reserved) == 4 &&
              offsetof(rg_i_metadata_head_t, total_columns) == 8 &&
              offsetof(rg_i_metadata_head_t, total_variable_length_columns) == 12);
static_assert(sizeof(rg_i_disk_metadata_record_t) == 28 && offsetof(rg_i_disk_metadata_record_t, head) == 12);
static_assert(sizeof(rg_disk_column_t) == 28);
static_assert(offsetof(rg_disk_column_t, type) == 4 && offsetof(rg_disk_column_t, qualifier) == 8 &&
              offsetof(rg_disk_column_t, properties) == 12 && offsetof(rg_disk_column_t, sd_defn_offset) == 16 &&
              offsetof(rg_disk_column_t, default_value) == 20);
static_assert(sizeof(rg_disk_sd_def_t) == 4);
static_assert(offsetof(disk_field_def, name_char_array) == 4 && sizeof(disk_field_def) == 5);
static_assert(sizeof(rg_i_disk_row_record_t) == 16 && offsetof(rg_i_disk_row_record_t, replaces_offset) == 12);
static_assert(sizeof(rg_i_disk_deleted_rows_record_t) == 16 && offsetof(rg_i_disk_deleted_rows_record_t, count) == 12);
static_assert(sizeof(rg_i_disk_commit_record_t) == 24);
static_assert(offsetof(rg_i_disk_commit_record_t, commit_data_length) == 12 &&
              offsetof(rg_i_disk_commit_record_t, change_counter) == 16);
static_assert(sizeof(rg_i_disk_application_metadata_element_t) == 8 &&
              offsetof(rg_i_disk_application_metadata_element_t, length) == 4);
static_assert(std::is_trivially_copyable_v<rg_disk_column_t> &&
              std::is_trivially_copyable_v<rg_i_disk_commit_record_t>);

// How much longer a record is in memory than on disk: its head, and in the metadata record each column.
inline constexpr kt_uint32_t RG_I_MEMORY_RECORD_EXCESS = 8;
inline constexpr kt_uint32_t RG_I_MEMORY_COLUMN_EXCESS = sizeof(rg_column_t) - sizeof(rg_disk_column_t);
static_assert(RG_I_MEMORY_COLUMN_EXCESS == 12);

// Reads a record or a word at any address.
template <class T> [[nodiscard]] inline T rg_i_load(const void * p)
{
    static_assert(std::is_trivially_copyable_v<T>);
    T value;
    std::memcpy(&value, p, sizeof value);
    return value;
}

// Writes a record or a word at any address.
template <class T> inline void rg_i_store(void * p, const T & value)
{
    static_assert(std::is_trivially_copyable_v<T>);
    std::memcpy(p, &value, sizeof value);
}
