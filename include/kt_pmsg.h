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

/* Result codes. Each function tells when it returns which. */
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

/* All functions may be called by several threads at once, as long as no thread changes what another one's call works
 * on. None of them sets an error record: the code is all there is. A failed call changes nothing that its description
 * doesn't name. Slots, items, headers and client values may lie at any address. */

/* Makes the stored form of a client value: fills the slot and, for an indirect type, lays the item at the running
 * offset and advances it.
 *
 * p_string_conversion_handle  from the client's code set to the table encoding (ku_iconv_open_1). Every string is
 *                             converted, also inside arrays and structured data; never the bytes of binaries and SBS.
 *                             NULL, or a handle that changes nothing: strings are taken as they are.
 * reserved                    not looked at; pass 0.
 * type                        KT_INT32 to KT_SD_PTR_ARRAY.
 * p_value                     the value; it stays the caller's. A NULL pointer in it, also in an array or structured
 *                             data, stands for the empty value of its type.
 * p_slot                      room for 8 bytes. A 32-bit number takes the first four, and the rest becomes zero; an
 *                             indirect value gets its anchor, whose offset counts from p_indirect_data.
 * p_indirect_data             start of the indirect data. What it holds from the running offset on may be anything:
 *                             every byte of the item is written. Neither this nor the next two are looked at for a
 *                             number.
 * indirect_data_capacity      bytes of indirect data from p_indirect_data on, those before the running offset included.
 * p_running_offset            where the item goes; grows by the item's length.
 *
 * Returns
 *   0                           done.
 *   KT_PMSG_E_UNSUPPORTED_TYPE  the type, or that of an element of structured data, is none of the above.
 *   KT_PMSG_E_CONVERSION        a string has a character without a counterpart.
 *   KT_PMSG_E_NO_MEMORY         no memory for a converted string. Without conversion nothing is allocated.
 *   KT_PMSG_E_DAMAGED           a missing argument, an SBS of negative length, or a value nested deeper than
 *                               KT_PMSG_MAXIMUM_NESTING (one that contains itself is).
 *   KT_PMSG_E_NO_ROOM           the item doesn't fit between the running offset and the capacity, or there are no
 *                               indirect data. Call again with more room.
 * After any failure the slot, the indirect data and the running offset are as they were.
 *
 * The forms of items: docs/PACKED-FORMAT.md. */
kt_int32_t kt_pmsg_build_conv_protocol_value_1(ku_iconv_t * p_string_conversion_handle, kt_uint32_t reserved,
                                               kt_data_type_t type, const kt_value_t * p_value, void * p_slot,
                                               void * p_indirect_data, kt_pmsg_len_t indirect_data_capacity,
                                               kt_pmsg_off_t * p_running_offset);

/* Tells how much the running offset grows when kt_pmsg_build_conv_protocol_value_1 builds the value without string
 * conversion: 0 for a number, else the exact length of the item.
 *
 * reserved1, reserved2  not looked at; callers pass 1 and 0.
 * type, p_value         as for building.
 * p_size                receives the bytes; untouched after a failure.
 *
 * Returns 0, KT_PMSG_E_UNSUPPORTED_TYPE or KT_PMSG_E_DAMAGED as building does, and KT_PMSG_E_NO_ROOM for a value whose
 * item would exceed 4 GiB - 1. Allocates nothing. */
kt_int32_t kt_pmsg_size_conv_protocol_value_1(kt_uint32_t reserved1, kt_uint32_t reserved2, kt_data_type_t type,
                                              const kt_value_t * p_value, kt_pmsg_len_t * p_size);

/* Makes a client value of a stored one: a number is copied, and anything else becomes one block of its own, with all
 * its strings and records, aligned for the client's types.
 *
 * p_string_conversion_handle  from the table encoding to the client's code set; otherwise as for building.
 * reserved                    not looked at; pass 0.
 * type                        KT_INT32 to KT_SD_PTR_ARRAY.
 * p_value                     receives the value. Of a 32-bit number, here and inside arrays and structured data, the
 *                             other four bytes are zero. An indirect value points to a malloc'ed block, which the
 *                             caller releases by one free, whatever the type.
 * p_slot                      the 8 bytes of the slot.
 * p_indirect_data             what the slot's anchor counts from; not looked at for a number.
 * indirect_data_bound         bytes that may be read from p_indirect_data on. 0xFFFFFFFF: none is known, and the slot's
 *                             own anchor is believed, which is right for rows that this process has made or checked.
 *
 * Returns
 *   0                           done.
 *   KT_PMSG_E_UNSUPPORTED_TYPE  the type, or that of an element of structured data, is none of the above.
 *   KT_PMSG_E_CONVERSION        a string has a character without a counterpart, or is not in the table encoding, or
 *                               the code set has zero bytes inside its characters.
 *   KT_PMSG_E_NO_MEMORY         no memory for the block or a converted string.
 *   KT_PMSG_E_DAMAGED           a missing argument, or an item that breaks a rule of its form, see below.
 * After any failure *p_value is untouched and nothing stays allocated.
 *
 * An item is checked whole before it is copied, so bytes from anywhere may be given to this call if their bound is
 * given too. It is refused as damaged if an anchor leaves the bound or the enclosing item, or points into that one's
 * head and slots; if a count or an inner length exceeds the item, or a string has no terminator in it; if the items of
 * one array or structured data are not in the order of its slots, or overlap; or if items are nested deeper than
 * KT_PMSG_MAXIMUM_NESTING. So work is in proportion to the item's length, and the block is never larger than about
 * twice the item, but for what a conversion adds to strings. Gaps between items are no damage. */
kt_int32_t kt_pmsg_build_conv_packed_client_value_1(ku_iconv_t * p_string_conversion_handle, kt_uint32_t reserved,
                                                    kt_data_type_t type, kt_value_t * p_value, const void * p_slot,
                                                    const void * p_indirect_data, kt_pmsg_len_t indirect_data_bound);

/* Puts the header of a message into the local byte order and tells whether the rest has to be converted.
 *
 * p_header    the header as it was received. If the writer's byte order is another one, kt_pmsg_length is reversed and
 *             kt_pmsg_arch_props becomes that of this machine, so a second call answers that nothing is to be done.
 * p_required  receives 1 if the values of the message have to be converted, else 0.
 *
 * Returns 0, or KT_PMSG_E_DAMAGED with nothing changed: a missing argument, a version other than 0, arch_props with
 * other bits than those of KT_PMSG_ARCH_..., or a length that is below that of the header. */
kt_int32_t kt_pmsg_cnv_required_1(kt_pmsg_header_t * p_header, kt_int32_t * p_required);

/* Converts a stored value that a machine of the other byte order wrote to the local order, in place: the slot, and the
 * item with everything inside it.
 *
 * p_slot               the 8 bytes of the slot, in the writer's order. Of a 32-bit number the first four are reversed.
 * type                 KT_INT32 to KT_SD_PTR_ARRAY; the types inside structured data are found in the item.
 * p_indirect_data      what the slot's anchor counts from; not looked at for a number.
 * indirect_data_bound  bytes that may be read and changed from p_indirect_data on. 0xFFFFFFFF: none is known, and the
 *                      slot's own anchor is believed.
 *
 * Of a binary the length word is reversed, and its bytes stay. Of an SBS the length word is reversed; if the rest
 * consists of fields from its first byte to its last, so is each field_length, and the data of a field that is one
 * number or resource handle by its field_dtype. An SBS that isn't made of fields keeps its bytes.
 *
 * Returns 0, KT_PMSG_E_UNSUPPORTED_TYPE or KT_PMSG_E_DAMAGED, in the cases that reading has for them. Everything is
 * checked before anything is changed: after a failure slot and item are as they were. A value must be converted once
 * only; a second call finds words in local order, takes them for foreign ones, and mostly ends with
 * KT_PMSG_E_DAMAGED. Allocates nothing. */
kt_int32_t kt_pmsg_convert_pmsg_value_within_1(void * p_slot, kt_data_type_t type, void * p_indirect_data,
                                               kt_pmsg_len_t indirect_data_bound);

/* kt_pmsg_convert_pmsg_value_within_1 without a bound. Only for a value whose slot is known to be sound: an anchor that
 * leaves the caller's memory leads this call out of it. */
kt_int32_t kt_pmsg_convert_pmsg_value_1(void * p_slot, kt_data_type_t type, void * p_indirect_data);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
