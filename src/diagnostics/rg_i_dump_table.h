// SPDX-License-Identifier: MIT
// rg_i_dump_table: prints the inner state of a table, item by item, for a person who hunts a fault.
//
// What is printed is chosen by bits: each item names those that it belongs to (required_detail), and is printed if the
// caller's detail_flags have one of them. Nothing is locked, reported or traced, and each item reaches the stream at
// once.
#pragma once

#include <cstdio>

#include "rg_i_table.h"

enum : kt_uint64_t {
    RG_I_DUMP_NAME                 = 1,
    RG_I_DUMP_REFERENCES           = 2,
    RG_I_DUMP_TOTAL_COLUMNS        = 4,
    RG_I_DUMP_COLUMN               = 8,
    RG_I_DUMP_COLUMN_NAME          = 16,
    RG_I_DUMP_COLUMN_TYPE          = 32,
    RG_I_DUMP_COLUMN_QUALIFIER     = 64,
    RG_I_DUMP_COLUMN_MODIFIERS     = 128,
    RG_I_DUMP_COLUMN_PROPERTIES    = 256,
    RG_I_DUMP_COLUMN_DEFINITION    = 512,
    RG_I_DUMP_COLUMN_DEFAULT       = 1024,
    RG_I_DUMP_ROW_COUNTERS         = 2048,
    RG_I_DUMP_ROW                  = 4096,
    RG_I_DUMP_APPLIED_RECORD       = 8192,
    RG_I_DUMP_COMMITTED_RECORD     = 16384,
    RG_I_DUMP_POINTERS             = 32768,
    RG_I_DUMP_APPLICATION_METADATA = 65536,
    RG_I_DUMP_VARIABLE_COLUMNS     = 131072,
    RG_I_DUMP_CONTROL              = 262144,
    RG_I_DUMP_VISIBILITY           = 524288,
    RG_I_DUMP_CHANGE_COUNTER       = 1048576,
    RG_I_DUMP_APPLIED_COUNTER      = 2097152,
    RG_I_DUMP_FILE                 = 4194304,
    RG_I_DUMP_POOL                 = 8388608,
    RG_I_DUMP_ALL                  = 0xFFFFFFFFFFFFFFFFu
};

// What vfprintf returns, or 0 if the item isn't wanted.
__attribute__((format(printf, 4, 5))) int rg_i_printf(kt_uint64_t required_detail, kt_uint64_t detail_flags,
                                                      FILE * p_stream, const kt_char_t * p_format, ...);

// Bytes in hexadecimal, width groups of four to a line. The last line's end is left to the caller.
void rg_i_dump_storage(const void * start, kt_uint32_t length, kt_uint32_t width, const kt_char_t * p_indent_prefix,
                       FILE * p_stream, kt_uint64_t detail_flags, kt_uint64_t required_detail);

[[nodiscard]] const kt_char_t * rg_i_get_type_string(kt_data_type_t type);
[[nodiscard]] const kt_char_t * rg_i_get_qualifier_type_string(rg_qualifier_t qualifier);

kt_int32_t dump_columns(const rg_i_table_t * p_table, kt_char_ptr_t p_record_data, const kt_char_t * p_indent_prefix,
                        FILE * p_stream, kt_uint64_t detail_flags, kt_uint64_t required_detail);
kt_int32_t dump_record_buffer_pool(const rg_i_record_buffer_pool_t * p_record_buffer_pool, FILE * p_stream,
                                   kt_uint64_t detail_flags);
