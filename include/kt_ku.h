/* SPDX-License-Identifier: MIT
 *
 * kt_ku.h: the utility library: the error record, locale and string conversion, the data type class table, the shared
 * empty values, the comparison of resource handles, and the selection language.
 *
 * All functions may be called from several threads at once. None starts a thread or holds a lock when it returns. What
 * they do on input out of the ordinary is told in docs/BAD-INPUT.md.
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
    KU_E_INVALID_ARGUMENT = 1, /* a NULL pointer, an unknown flag, a category that doesn't exist */
    KU_E_UNKNOWN_CODESET  = 2, /* the system can't convert to and from that code set */
    KU_E_NO_COUNTERPART   = 3, /* not text of its code set, or a character that the other one hasn't */
    KU_E_TOO_LONG         = 4, /* the result would have 4 GiB or more */
    KU_E_NO_MEMORY        = 5
};

/* ---- The error record ------------------------------------------------------------------------------------------ */

/* What the last failure of the calling thread was. All pointers stay valid until the thread's next call into any of the
 * libraries; copy what is to be kept longer. */
typedef struct ku_error_record_t {
    kt_int32_t        code;      /* 0: no error stands */
    kt_int32_t        set;       /* message set in the catalog */
    kt_int32_t        message;   /* index of the text in the set */
    const kt_char_t * p_catalog; /* name of the catalog file, such as "kt_rg.cat" */
    const kt_char_t * p_text;    /* the formatted message; "" if no error stands */
} ku_error_record_t;

/* Sets the calling thread's error record and formats its message.
 *
 *   code            the failure; 0 is the same as ku_set_no_error_1
 *   reserved        0; not looked at
 *   p_catalog       name of the message catalog, at most 127 bytes of which are kept; copied
 *   set, message_index  where the message stands in the catalog
 *   p_default_text  a printf format, as a rule with positional conversions ("%1$s"), used where no catalog has the
 *                   message. NULL counts as ""
 *   ...             the arguments of p_default_text
 *
 * The text comes from the catalog if the locale's messages category (LC_MESSAGES, as setlocale left it) isn't C or
 * POSIX, catopen finds the catalog by NLSPATH, and the text there takes exactly the arguments that p_default_text
 * takes, in any order. A catalog is looked for once for each locale in a process's life. A message longer than 12 KiB
 * is cut at a character's border, and ends with a newline.
 *
 * Allocates nothing and cannot fail: if the system has not one page left for a thread's first message, the text is
 * p_default_text with its conversions unresolved. Keeps errno. May be called under any lock and in a forked child. */
void ku_set_error_1(kt_int32_t code, kt_int32_t reserved, const kt_char_t * p_catalog, kt_int32_t set,
                    kt_int32_t message_index, const kt_char_t * p_default_text, ...);

/* Clears the calling thread's error record. Costs one store. */
void ku_set_no_error_1(void);

/* Fills *p_record with the calling thread's error record; code 0, zeros and empty strings if no error stands. A NULL
 * p_record is passed over. Other threads' failures are never seen. */
void ku_get_error_record_1(ku_error_record_t * p_record);

/* ---- Locale and string conversion ------------------------------------------------------------------------------ */

/* A conversion between one code set and the table encoding, in one direction. */
typedef struct ku_iconv_t ku_iconv_t;

/* Flags of ku_iconv_open_1. */
enum {
    KU_ICONV_TO_TABLE             = 0,
    KU_ICONV_FROM_TABLE           = 1,
    KU_ICONV_UTF8_IS_NOT_MODIFIED = 8 /* a code set of UTF-8 passes bytes through; it always does */
};

/* Delivers what the process's locale is.
 *
 *   p_category_count, p_p_category_list  in: how many categories (LC_TIME...) are asked for, and the caller's array of
 *                                        them, which stays the caller's. Out: a copy of the array, or NULL for a count
 *                                        of 0
 *   p_p_category_locales                 out: the name of the locale of each category, or NULL for a count of 0
 *   p_item_count, p_p_item_list          the same for items of nl_langinfo (RADIXCHAR, DAY_1...)
 *   p_p_item_langinfo                    out: the text of each item, or NULL for a count of 0
 *   p_p_codeset                          out: the name of the locale's code set
 *
 * Returns 0; KU_E_INVALID_ARGUMENT for a NULL pointer, a count without an array, a category that doesn't exist;
 * KU_E_NO_MEMORY. What was delivered goes back through ku_rel_locale_info_1; after a failure all outputs are NULL
 * (untouched if one of the seven pointers was NULL). As with setlocale, no thread may change the process's locale
 * meanwhile. */
kt_int32_t ku_get_locale_info_1(kt_uint32_t * p_category_count, kt_int32_t ** p_p_category_list,
                                kt_char_ptr_t ** p_p_category_locales, kt_uint32_t * p_item_count,
                                kt_int32_t ** p_p_item_list, kt_char_ptr_t ** p_p_item_langinfo,
                                kt_char_ptr_t * p_p_codeset);

/* Releases what ku_get_locale_info_1 delivered; each argument may be NULL. */
void ku_rel_locale_info_1(kt_int32_t * p_category_list, kt_char_ptr_t * p_category_locales, kt_int32_t * p_item_list,
                          kt_char_ptr_t * p_item_langinfo, kt_char_ptr_t p_codeset);

/* Whether conversion handles should be opened with KU_ICONV_UTF8_IS_NOT_MODIFIED. Returns 1. */
kt_int32_t ku_utf8_is_not_modified_1(void);

/* Makes a conversion handle.
 *
 *   p_codeset   name of the code set, as iconv knows it. UTF-8 and the code set of the C/POSIX locale
 *               (ANSI_X3.4-1968, US-ASCII, "C" and the like, in any case of letters) need no conversion: such a handle
 *               passes bytes through unchanged, whatever they are
 *   flags       KU_ICONV_TO_TABLE or KU_ICONV_FROM_TABLE, with or without KU_ICONV_UTF8_IS_NOT_MODIFIED
 *   p_p_handle  receives the handle, which goes back through ku_iconv_close_1; untouched after a failure
 *
 * Returns 0, KU_E_INVALID_ARGUMENT, KU_E_UNKNOWN_CODESET (also for "" and for a name with a "/", since the suffixes of
 * iconv lose characters) or KU_E_NO_MEMORY. */
kt_int32_t ku_iconv_open_1(const kt_char_t * p_codeset, kt_int32_t flags, ku_iconv_t ** p_p_handle);

/* Releases a handle that nobody is using any more. Returns 0, or KU_E_INVALID_ARGUMENT for NULL. */
kt_int32_t ku_iconv_close_1(ku_iconv_t * p_handle);

/* Converts a string.
 *
 *   p_handle       a handle; NULL passes bytes through. Several threads may use one handle at once, without waiting for
 *                  each other
 *   flags          0
 *   p_input        the string
 *   p_input_size   bytes to read from it; 0: up to its terminator. Not changed
 *   p_p_output     receives the result, terminated, from malloc: the caller frees it
 *   p_output_size  receives the bytes of the result, its terminator not counted
 *
 * Returns 0, KU_E_INVALID_ARGUMENT, KU_E_NO_COUNTERPART, KU_E_TOO_LONG or KU_E_NO_MEMORY. After a failure the outputs
 * are untouched: nothing is ever converted in part. */
kt_int32_t ku_iconv_str_1(ku_iconv_t * p_handle, kt_int32_t flags, const kt_char_t * p_input,
                          kt_uint32_t * p_input_size, kt_char_ptr_t * p_p_output, kt_uint32_t * p_output_size);

/* Non-zero if the handle passes bytes through unchanged, so that a caller may copy instead of converting. NULL does. */
kt_int32_t ku_iconv_is_identity_1(const ku_iconv_t * p_handle);

/* ---- Data types and empty values ------------------------------------------------------------------------------- */

/* Class bits of each data type, by its number. KU_DTC_INDIRECT: values of the type don't lie in their slot, but behind
 * it at an offset that the slot tells (docs/FILE-FORMAT.md). */
enum { KU_DTC_INDIRECT = 4, KU_DTC_TYPES = 23 };
extern const kt_uint32_t ku_dtc_table_1[KU_DTC_TYPES];

/* The empty value of each kind: what stands for a NULL pointer of that kind. Shared and read-only; never free them.
 * The empty array also stands for an empty self-describing byte string. */
extern const kt_char_ptr_t            ku_ptr_empty_char_1;
extern const kt_binary_ptr_t          ku_ptr_empty_binary_1;
extern const kt_resource_handle_ptr_t ku_ptr_invld_rsrc_hndl_1;
extern const kt_sd_ptr_t              ku_ptr_empty_sd_1;
extern const kt_array_ptr_t           ku_ptr_empty_array_1;

/* Compares two kt_resource_handle_t, at any alignment, word by word as unsigned numbers from header to id4. Returns 0
 * if they are equal, else -1 or 1: the order of the first words that differ. Has the form of a compare function of a
 * hashed table. */
kt_int32_t ku_rsrc_hndl_cmp_1(void * p_handle1, void * p_handle2);

/* ---- The selection language ------------------------------------------------------------------------------------ */

/* The language is told in docs/SELECTION.md. */

/* What ku_comp_expr_1 and ku_exec_expr_1 return besides 0. */
enum {
    KU_EXPR_E_SYNTAX          = 1, /* compiling: the text isn't an expression. Running: a NULL argument */
    KU_EXPR_E_NO_SUCH_NAME    = 2, /* a column or field that the callback doesn't know */
    KU_EXPR_E_TYPES           = 3, /* types that don't fit together, or an expression that isn't a number */
    KU_EXPR_E_TOO_LONG        = 4, /* over 1 MiB, over 250 levels of nesting, or too large a regular expression */
    KU_EXPR_E_NO_MEMORY       = 5,
    KU_EXPR_E_INTEGER_FAULT   = 6, /* running: a result outside -2^63 to 2^64-1, or a division by zero */
    KU_EXPR_E_NO_SUCH_ELEMENT = 7, /* running: an index outside its array, a field that a structure doesn't have */
    KU_EXPR_E_DAMAGED_VALUE   = 8  /* running: a stored value that isn't well formed */
};

/* What a name stands for. */
typedef struct ku_validate_data_t {
    kt_data_type_t type;
    kt_uint32_t    id; /* of a column: the position of its slot; of a field: its position in the structured data */
} ku_validate_data_t;

/* Answers what a name stands for.
 *
 *   token          as given to ku_comp_expr_1
 *   p_name         the name, terminated
 *   length         its bytes without the terminator
 *   parent_id      0xFFFFFFFF: a column is asked for. Else the id of a column of structured data, or of an array of
 *                  structured data, whose field is asked for
 *   p_return_data  receives the answer
 *
 * Returns 0, or anything else if there is no such name. */
typedef kt_int32_t ku_validate_callback_t(void * token, kt_char_t * p_name, kt_uint32_t length, kt_uint32_t parent_id,
                                          ku_validate_data_t * p_return_data);

/* Compiles an expression.
 *
 *   p_text          the expression in UTF-8, terminated, at most 1 MiB
 *   flags           0; not looked at
 *   callback        called for each name in the text, in no stated order, possibly more than once for one name
 *   token           passed to the callback
 *   p_p_compiled    receives the compiled expression, which goes back through ku_free_expr_1; untouched after a failure
 *
 * Returns 0, KU_EXPR_E_SYNTAX (also for a NULL argument), KU_EXPR_E_NO_SUCH_NAME, KU_EXPR_E_TYPES, KU_EXPR_E_TOO_LONG
 * or KU_EXPR_E_NO_MEMORY. ku_expr_diagnosis_1 tells where and why. Time and memory are in proportion to the text, but
 * that the elements of lists are sorted. Sets no error record. */
kt_int32_t ku_comp_expr_1(kt_char_ptr_t p_text, kt_uint32_t flags, ku_validate_callback_t callback, void * token,
                          void ** p_p_compiled);

/* Runs a compiled expression on a row.
 *
 *   p_compiled       from ku_comp_expr_1; several threads may run it at once
 *   flags            16; not looked at
 *   p_values         the row's first slot; the slots are 8 bytes each, without gaps, at any alignment
 *   total_values     how many slots the row has
 *   p_result         receives 1 if the expression is true of the row and 0 otherwise; untouched after a failure
 *   p_indirect_data  where the offsets of the row's indirect values count from (docs/FILE-FORMAT.md)
 *
 * Returns 0; KU_EXPR_E_INTEGER_FAULT; KU_EXPR_E_NO_SUCH_ELEMENT, also for a column at or behind total_values;
 * KU_EXPR_E_DAMAGED_VALUE; KU_EXPR_E_SYNTAX if a pointer is NULL. A row whose evaluation gives 6, 7 or 8 should count
 * as not matching. Allocates nothing, sets no error record.
 *
 * How far the indirect data goes isn't known here, so every offset is believed: use ku_exec_expr_within_1 on rows that
 * may be damaged. */
kt_int32_t ku_exec_expr_1(void * p_compiled, kt_uint32_t flags, const void * p_values, kt_uint32_t total_values,
                          kt_uint32_t * p_result, const void * p_indirect_data);

/* The same, with the number of bytes that p_indirect_data has: nothing beyond them is read, and a value that would lie
 * there is KU_EXPR_E_DAMAGED_VALUE. */
kt_int32_t ku_exec_expr_within_1(void * p_compiled, kt_uint32_t flags, const void * p_values, kt_uint32_t total_values,
                                 kt_uint32_t * p_result, const void * p_indirect_data, kt_uint32_t indirect_length);

/* How the rows lie that ku_exec_expr_on_rows_1 is given: each around an address of its own, and all alike. Offsets are
 * bytes from that address. */
typedef struct ku_row_form_t {
    kt_uint32_t total_values;    /* slots of a row */
    kt_int32_t  values_offset;   /* of the first slot */
    kt_int32_t  indirect_offset; /* of the place where the offsets of indirect values count from */
    kt_int32_t  length_offset; /* of a word of 4 bytes, at any alignment, that tells how much indirect data there is: */
    kt_uint32_t length_excess; /* the bytes of it, and so many more; a word below that stands for none */
} ku_row_form_t;

/* Runs a compiled expression on up to 64 rows.
 *
 *   p_compiled   from ku_comp_expr_1; several threads may run it at once
 *   flags        16; not looked at
 *   p_form       how the rows lie
 *   p_p_rows     the rows' addresses
 *   rows         which of them to look at: bit i stands for p_p_rows[i]. An address without its bit isn't looked at
 *   p_matching   receives the rows on which ku_exec_expr_within_1 would give 0 and the truth 1, in the same form
 *
 * Returns 0, or KU_EXPR_E_SYNTAX if a pointer is NULL. Allocates nothing, sets no error record. */
kt_int32_t ku_exec_expr_on_rows_1(void * p_compiled, kt_uint32_t flags, const ku_row_form_t * p_form,
                                  const void * const * p_p_rows, kt_uint64_t rows, kt_uint64_t * p_matching);

/* Releases a compiled expression that nobody is running any more; NULL is passed over. flags: 0; not looked at. */
void ku_free_expr_1(void * p_compiled, kt_uint32_t flags);

/* Why the calling thread's last ku_comp_expr_1 failed, such as `column 17: no column named "Nmae"`, with "line 2, " in
 * front if the text has several lines; "" if it succeeded, or if there was none. Lines and columns count from 1,
 * columns in characters. Valid until the thread's next ku_comp_expr_1. */
const kt_char_t * ku_expr_diagnosis_1(void);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
