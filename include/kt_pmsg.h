/* SPDX-License-Identifier: MIT
 *
 * kt_pmsg.h: the stored and wire form of values: building it from client values, measuring it, reading it back, and
 * changing its byte order.
 *
 * A stored value is an 8-byte slot: a scalar, or an anchor into an area of indirect data that holds the item. The forms
 * of the items are told in docs/PACKED-FORMAT.md.
 */
#ifndef KT_PMSG_H
#define KT_PMSG_H

#include "kt_ku.h"
#include "kt_types.h"

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

typedef kt_uint32_t kt_pmsg_off_t;
typedef kt_uint32_t kt_pmsg_len_t;

/* Where an item of indirect data lies: offset from the start of the enclosing indirect data, and bytes it takes. */
typedef struct kt_pmsg_value_anchor_t {
    kt_pmsg_off_t offset;
    kt_pmsg_len_t length;
} kt_pmsg_value_anchor_t;

/* One stored slot. Slots stand in records at any alignment: copy them in and out, never form a pointer to one inside a
 * record but to hand it to the functions below, which copy too. */
typedef union kt_pmsg_value_t {
    kt_int32_t             val_int32;
    kt_uint32_t            val_uint32;
    kt_int64_t             val_int64;
    kt_uint64_t            val_uint64;
    kt_float32_t           val_float32;
    kt_float64_t           val_float64;
    kt_pmsg_value_anchor_t val_anchor;
} kt_pmsg_value_t;

/* The head of a message. */
typedef struct kt_pmsg_header_t {
    kt_pmsg_len_t kt_pmsg_length; /* bytes of the whole message, this header included */
    kt_uint8_t    kt_pmsg_version;
    kt_uint8_t    kt_pmsg_arch_props; /* KT_PMSG_ARCH_... bits of the machine that wrote the message */
    kt_uint8_t    kt_pmsg_proto_type;
    kt_uint8_t    kt_pmsg_spare;
} kt_pmsg_header_t;

enum { KT_PMSG_ARCH_BIG_ENDIAN = 1, KT_PMSG_ARCH_64_BIT = 2 };

/* Result codes. */
enum {
    KT_PMSG_E_UNSUPPORTED_TYPE = 1,
    KT_PMSG_E_CONVERSION       = 2,
    KT_PMSG_E_NO_MEMORY        = 3,
    KT_PMSG_E_DAMAGED          = 4,
    KT_PMSG_E_NO_ROOM          = 5
};

/* Items nested deeper than this are refused as damaged. */
enum { KT_PMSG_MAXIMUM_NESTING = 32 };

KT_STATIC_ASSERT(sizeof(kt_pmsg_value_anchor_t) == 8, "kt_pmsg_value_anchor_t");
KT_STATIC_ASSERT(sizeof(kt_pmsg_value_t) == 8, "kt_pmsg_value_t is one slot");
KT_STATIC_ASSERT(sizeof(kt_pmsg_header_t) == 8 && offsetof(kt_pmsg_header_t, kt_pmsg_arch_props) == 5,
                 "kt_pmsg_header_t");

kt_int32_t kt_pmsg_build_conv_protocol_value_1(ku_iconv_t * p_string_conversion_handle, kt_uint32_t reserved,
                                               kt_data_type_t type, const kt_value_t * p_value, void * p_slot,
                                               void * p_indirect_data, kt_pmsg_len_t indirect_data_capacity,
                                               kt_pmsg_off_t * p_running_offset);
kt_int32_t kt_pmsg_size_conv_protocol_value_1(kt_uint32_t reserved1, kt_uint32_t reserved2, kt_data_type_t type,
                                              const kt_value_t * p_value, kt_pmsg_len_t * p_size);
kt_int32_t kt_pmsg_build_conv_packed_client_value_1(ku_iconv_t * p_string_conversion_handle, kt_uint32_t reserved,
                                                    kt_data_type_t type, kt_value_t * p_value, const void * p_slot,
                                                    const void * p_indirect_data, kt_pmsg_len_t indirect_data_bound);
kt_int32_t kt_pmsg_cnv_required_1(kt_pmsg_header_t * p_header, kt_int32_t * p_required);
kt_int32_t kt_pmsg_convert_pmsg_value_within_1(void * p_slot, kt_data_type_t type, void * p_indirect_data,
                                               kt_pmsg_len_t indirect_data_bound);
kt_int32_t kt_pmsg_convert_pmsg_value_1(void * p_slot, kt_data_type_t type, void * p_indirect_data);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
