/* SPDX-License-Identifier: MIT
 *
 * kt_tr.h: the trace library: components register, their events go to a sink or to a file, or nowhere.
 */
#ifndef KT_TR_H
#define KT_TR_H

#include "kt_types.h"

#ifdef __cplusplus
extern "C" {
#endif
#pragma GCC visibility push(default)

/* Failures of tr_set_level_1. */
enum { TR_E_UNKNOWN_COMPONENT = 1, TR_E_UNKNOWN_CATEGORY = 2 };

typedef kt_uint8_t tr_detail_level_t;

typedef struct tr_category_description_t {
    kt_uint32_t category_id;
    kt_char_t * category_name;
    kt_uint32_t default_level_of_detail;
    kt_uint32_t minimum_level_of_detail;
} tr_category_description_t;

typedef enum { TR_EVENT_ID, TR_EVENT_VALUES, TR_EVENT_STRINGS, TR_EVENT_ERROR, TR_EVENT_FORMATTED } tr_event_kind_t;

typedef struct tr_event_t {
    tr_event_kind_t           kind;
    const kt_char_t *         p_component; /* such as "_RGA" */
    kt_uint32_t               id;          /* id or category; 0 for an error */
    kt_uint32_t               count;       /* values or strings */
    const kt_uint32_t *       p_values;
    const kt_char_t * const * p_strings;
    const kt_char_t *         p_function; /* error location */
    const kt_char_t *         p_source_file;
    kt_uint32_t               line;
    const kt_char_t *         p_text;      /* formatted line */
    kt_uint64_t               nanoseconds; /* CLOCK_MONOTONIC */
    kt_uint64_t               thread;
} tr_event_t;

typedef void tr_sink_t(void * p_token, const tr_event_t * p_event);

void       tr_register_component_1(const kt_char_t * p_component, tr_detail_level_t * p_levels,
                                   const tr_category_description_t * p_categories, kt_uint32_t total_categories);
void       tr_record_id_1(const kt_char_t * p_component, kt_uint32_t id);
void       tr_record_values_32_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...);
void       tr_record_strings_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...);
void       tr_record_error_1(const kt_char_t * p_component, kt_uint32_t category, const kt_char_t * p_function,
                             kt_uint32_t line, const kt_char_t * p_source_file, kt_uint32_t reserved);
void       tr_record_fmt_string_1(const kt_char_t * p_component, kt_uint32_t category, const kt_char_t * p_format, ...);
kt_int32_t tr_set_level_1(const kt_char_t * p_component, const kt_char_t * p_category_name, kt_uint32_t level);
void       tr_set_sink_1(tr_sink_t * p_sink, void * p_token);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
