/* SPDX-License-Identifier: MIT
 *
 * kt_ku.h: the utility library: the error record, locale and string conversion, the data type class table, the shared
 * empty values and the comparison of resource handles.
 */
#ifndef KT_KU_H
#define KT_KU_H

#include "kt_types.h"

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

/* What ku_get_locale_info_1 and the ku_iconv_ functions return on a failure. */
enum {
    KU_E_INVALID_ARGUMENT = 1,
    KU_E_UNKNOWN_CODESET  = 2,
    KU_E_NO_COUNTERPART   = 3,
    KU_E_TOO_LONG         = 4,
    KU_E_NO_MEMORY        = 5
};

/* ---- The error record ------------------------------------------------------------------------------------------ */

typedef struct ku_error_record_t {
    kt_int32_t        code;      /* 0: no error stands */
    kt_int32_t        set;       /* message set in the catalog */
    kt_int32_t        message;   /* index of the text in the set */
    const kt_char_t * p_catalog; /* name of the catalog file, such as "kt_rg.cat" */
    const kt_char_t * p_text;    /* the formatted message; "" if no error stands */
} ku_error_record_t;

void ku_set_error_1(kt_int32_t code, kt_int32_t reserved, const kt_char_t * p_catalog, kt_int32_t set,
                    kt_int32_t message_index, const kt_char_t * p_default_text, ...);
void ku_set_no_error_1(void);
void ku_get_error_record_1(ku_error_record_t * p_record);

/* ---- Locale and string conversion ------------------------------------------------------------------------------ */

typedef struct ku_iconv_t ku_iconv_t;

/* Flags of ku_iconv_open_1. */
enum { KU_ICONV_TO_TABLE = 0, KU_ICONV_FROM_TABLE = 1, KU_ICONV_UTF8_IS_NOT_MODIFIED = 8 };

kt_int32_t ku_get_locale_info_1(kt_uint32_t * p_category_count, kt_int32_t ** p_p_category_list,
                                kt_char_ptr_t ** p_p_category_locales, kt_uint32_t * p_item_count,
                                kt_int32_t ** p_p_item_list, kt_char_ptr_t ** p_p_item_langinfo,
                                kt_char_ptr_t * p_p_codeset);
void ku_rel_locale_info_1(kt_int32_t * p_category_list, kt_char_ptr_t * p_category_locales, kt_int32_t * p_item_list,
                          kt_char_ptr_t * p_item_langinfo, kt_char_ptr_t p_codeset);
kt_int32_t ku_utf8_is_not_modified_1(void);
kt_int32_t ku_iconv_open_1(const kt_char_t * p_codeset, kt_int32_t flags, ku_iconv_t ** p_p_handle);
kt_int32_t ku_iconv_close_1(ku_iconv_t * p_handle);
kt_int32_t ku_iconv_str_1(ku_iconv_t * p_handle, kt_int32_t flags, const kt_char_t * p_input,
                          kt_uint32_t * p_input_size, kt_char_ptr_t * p_p_output, kt_uint32_t * p_output_size);
/* Non-zero if the handle passes bytes through unchanged, so that a caller may copy instead of converting. NULL does. */
kt_int32_t ku_iconv_is_identity_1(const ku_iconv_t * p_handle);

/* ---- Data types and empty values ------------------------------------------------------------------------------- */

/* Class bits of each data type. Bit value 4: values of the type are stored indirectly. */
enum { KU_DTC_INDIRECT = 4, KU_DTC_TYPES = 23 };
extern const kt_uint32_t ku_dtc_table_1[KU_DTC_TYPES];

/* The empty value of each kind. Shared, read-only, never released. */
extern const kt_char_ptr_t            ku_ptr_empty_char_1;
extern const kt_binary_ptr_t          ku_ptr_empty_binary_1;
extern const kt_resource_handle_ptr_t ku_ptr_invld_rsrc_hndl_1;
extern const kt_sd_ptr_t              ku_ptr_empty_sd_1;
extern const kt_array_ptr_t           ku_ptr_empty_array_1;

/* Compares two kt_resource_handle_t at any alignment: 0 equal, else the sign of the first differing word. */
kt_int32_t ku_rsrc_hndl_cmp_1(void * p_handle1, void * p_handle2);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
