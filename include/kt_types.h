/* SPDX-License-Identifier: MIT
 *
 * kt_types.h: the scalar types, data types and client value records that all four libraries share.
 *
 * Valid C11 and C++. A client value is a kt_value_t: a scalar lies in the union itself, anything else is a pointer to
 * one of the records below. Records of variable length end in an array of one element whose true length is the count
 * that stands ahead of it: allocate with room for the rest.
 */
#ifndef KT_TYPES_H
#define KT_TYPES_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

typedef char     kt_char_t;
typedef int8_t   kt_int8_t;
typedef uint8_t  kt_uint8_t;
typedef int16_t  kt_int16_t;
typedef uint16_t kt_uint16_t;
typedef int32_t  kt_int32_t;
typedef uint32_t kt_uint32_t;
typedef int64_t  kt_int64_t;
typedef uint64_t kt_uint64_t;
typedef float    kt_float32_t;
typedef double   kt_float64_t;

/* The type of a column, a field or an element. Stands in files and on the wire: never renumber. Types 8 to 22 are
 * stored indirectly (ku_dtc_table_1 in kt_ku.h). The type is a plain 32-bit word, so that any number read from a file
 * or a buffer is a valid value of it. */
typedef kt_uint32_t kt_data_type_t;
enum {
    KT_UNKNOWN               = 0,
    KT_NONE                  = 1,
    KT_INT32                 = 2,
    KT_UINT32                = 3,
    KT_INT64                 = 4,
    KT_UINT64                = 5,
    KT_FLOAT32               = 6,
    KT_FLOAT64               = 7,
    KT_CHAR_PTR              = 8,
    KT_BINARY_PTR            = 9,
    KT_RSRC_HANDLE_PTR       = 10,
    KT_SD_PTR                = 11,
    KT_SBS_PTR               = 12,
    KT_INT32_ARRAY           = 13,
    KT_UINT32_ARRAY          = 14,
    KT_INT64_ARRAY           = 15,
    KT_UINT64_ARRAY          = 16,
    KT_FLOAT32_ARRAY         = 17,
    KT_FLOAT64_ARRAY         = 18,
    KT_CHAR_PTR_ARRAY        = 19,
    KT_BINARY_PTR_ARRAY      = 20,
    KT_RSRC_HANDLE_PTR_ARRAY = 21,
    KT_SD_PTR_ARRAY          = 22
};

typedef kt_char_t * kt_char_ptr_t;

/* A run of bytes. */
typedef struct kt_binary_t {
    kt_uint32_t length; /* bytes in data */
    kt_uint8_t  data[1];
} kt_binary_t;
typedef kt_binary_t * kt_binary_ptr_t;

typedef struct kt_resource_id_t {
    kt_uint32_t id1;
    kt_uint32_t id2;
    kt_uint32_t id3;
    kt_uint32_t id4;
} kt_resource_id_t;

/* The name of a resource: a header word and a 128-bit identity. */
typedef struct kt_resource_handle_t {
    kt_uint32_t      header;
    kt_resource_id_t id;
} kt_resource_handle_t;
typedef kt_resource_handle_t * kt_resource_handle_ptr_t;

/* A self-describing byte string: a length, and then that many bytes of fields, the first of which is field1. */
typedef struct kt_sbs_field_t {
    kt_int16_t field_length;
    kt_int8_t  field_dtype;
    kt_int8_t  field_sn;
    kt_uint8_t field_data[1];
} kt_sbs_field_t;

typedef struct kt_sbs_t {
    kt_int32_t     length; /* bytes that follow this word */
    kt_sbs_field_t field1;
} kt_sbs_t;
typedef kt_sbs_t * kt_sbs_ptr_t;

typedef struct kt_structured_data_t kt_structured_data_t;
typedef kt_structured_data_t *      kt_sd_ptr_t;
typedef struct kt_array_t           kt_array_t;
typedef kt_array_t *                kt_array_ptr_t;

/* One client value. Eight bytes, whatever it holds; which member counts is told by the type beside it. */
typedef union kt_value_t {
    kt_int32_t               val_int32;
    kt_uint32_t              val_uint32;
    kt_int64_t               val_int64;
    kt_uint64_t              val_uint64;
    kt_float32_t             val_float32;
    kt_float64_t             val_float64;
    kt_char_ptr_t            ptr_char;
    kt_binary_ptr_t          ptr_binary;
    kt_resource_handle_ptr_t ptr_rsrc_handle;
    kt_sd_ptr_t              ptr_sd;
    kt_sbs_ptr_t             ptr_sbs;
    kt_array_ptr_t           ptr_array;
} kt_value_t;

/* An array of values of one type; the type stands beside the array (KT_INT32_ARRAY and so on). */
struct kt_array_t {
    kt_uint32_t element_count;
    kt_uint32_t pad;
    kt_value_t  elements[1];
};

typedef struct kt_structured_data_element_t {
    kt_data_type_t data_type;
    kt_uint32_t    pad;
    kt_value_t     value;
} kt_structured_data_element_t;

/* Structured data: values that each carry their own type. */
struct kt_structured_data_t {
    kt_uint32_t                  element_count;
    kt_uint32_t                  pad;
    kt_structured_data_element_t elements[1];
};

#ifdef __cplusplus
#define KT_STATIC_ASSERT(condition, text) static_assert(condition, text)
#else
#define KT_STATIC_ASSERT(condition, text) _Static_assert(condition, text)
#endif

KT_STATIC_ASSERT(sizeof(void *) == 8, "the records are laid out for 64-bit machines");
KT_STATIC_ASSERT(sizeof(kt_value_t) == 8, "kt_value_t is one slot");
KT_STATIC_ASSERT(sizeof(kt_binary_t) == 8 && offsetof(kt_binary_t, data) == 4, "kt_binary_t");
KT_STATIC_ASSERT(sizeof(kt_resource_handle_t) == 20 && offsetof(kt_resource_handle_t, id) == 4, "kt_resource_handle_t");
KT_STATIC_ASSERT(offsetof(kt_sbs_t, field1) == 4 && offsetof(kt_sbs_field_t, field_data) == 4, "kt_sbs_t");
KT_STATIC_ASSERT(sizeof(kt_array_t) == 16 && offsetof(kt_array_t, elements) == 8, "kt_array_t");
KT_STATIC_ASSERT(sizeof(kt_structured_data_element_t) == 16 && offsetof(kt_structured_data_element_t, value) == 8,
                 "kt_structured_data_element_t");
KT_STATIC_ASSERT(sizeof(kt_structured_data_t) == 24 && offsetof(kt_structured_data_t, elements) == 8,
                 "kt_structured_data_t");

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
