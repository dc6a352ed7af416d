/* SPDX-License-Identifier: MIT
 *
 * kt_tr.h: the trace library: components register, their events go to a sink or to a file, or nowhere.
 *
 * By default nothing is recorded, and an event costs a load and a branch. The environment can change that:
 *
 *   KT_TRACE       sets levels when a component registers: "_RGA:API=1,Errors=1", "_RGA:*=255"; several components are
 *                  separated by ";". Levels run from 0 to 255; what is in no such form is passed over
 *   KT_TRACE_FILE  the file that gets a line per event, appended in one write each (default: standard error). Taken at
 *                  the first line that a process writes
 *
 * An event becomes a line if its component has any non-zero level. A program can set levels and a sink of its own.
 * All functions may be called from several threads at once, under any lock; all keep errno, and none of them fails but
 * tr_set_level_1.
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

/* How much of a category is wanted: 0 nothing. */
typedef kt_uint8_t tr_detail_level_t;

typedef struct tr_category_description_t {
    kt_uint32_t category_id;
    kt_char_t * category_name;
    kt_uint32_t default_level_of_detail; /* on registration */
    kt_uint32_t minimum_level_of_detail; /* whatever is set later, the level isn't below this */
} tr_category_description_t;

typedef enum {
    TR_EVENT_ID,       /* id */
    TR_EVENT_VALUES,   /* id, count, p_values */
    TR_EVENT_STRINGS,  /* id, count, p_strings */
    TR_EVENT_ERROR,    /* p_function, line, p_source_file */
    TR_EVENT_FORMATTED /* id (the category), p_text */
} tr_event_kind_t;

/* An event as a sink gets it; valid during the call. Texts that the kind has no use for are "". */
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
    kt_uint64_t               thread;      /* the system's number of the thread */
} tr_event_t;

/* Gets events, on the thread that makes them, with whatever locks that thread holds: it must not call back into what it
 * traces in a way that takes them. Several threads may be in it at once. Events made inside a sink are dropped. */
typedef void tr_sink_t(void * p_token, const tr_event_t * p_event);

/* Registers a component.
 *
 *   p_component       its name, at most 31 bytes; copied
 *   p_levels          one byte per category, owned by the component and alive for good. This library writes them from
 *                     now on, the component reads them, without a lock: it makes events only where its byte asks for it
 *   p_categories      their descriptions, total_categories of them, alive for good
 *
 * The bytes get the default levels, and then those of KT_TRACE. Registering the same bytes again changes nothing. The
 * 129th component of a process isn't traced. */
void tr_register_component_1(const kt_char_t * p_component, tr_detail_level_t * p_levels,
                             const tr_category_description_t * p_categories, kt_uint32_t total_categories);

/* An event that is its id alone. */
void tr_record_id_1(const kt_char_t * p_component, kt_uint32_t id);

/* An event with count values of type kt_uint32_t; those behind the 64th are left out. */
void tr_record_values_32_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...);

/* An event with count strings of type const kt_char_t *; those behind the 32nd are left out. */
void tr_record_strings_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...);

/* An error's location. category and reserved aren't looked at. */
void tr_record_error_1(const kt_char_t * p_component, kt_uint32_t category, const kt_char_t * p_function,
                       kt_uint32_t line, const kt_char_t * p_source_file, kt_uint32_t reserved);

/* A development line, formatted as by printf and cut at 2047 bytes. Not gated by any level byte of the component's: it
 * reaches a sink always, and the file if the component has any non-zero level. */
void tr_record_fmt_string_1(const kt_char_t * p_component, kt_uint32_t category, const kt_char_t * p_format, ...);

/* Sets the level of a category, or of all with "*" or NULL, in every registered component of that name. A level above
 * 255 counts as 255. Returns 0, TR_E_UNKNOWN_COMPONENT if none of that name has registered (yet), or
 * TR_E_UNKNOWN_CATEGORY. */
kt_int32_t tr_set_level_1(const kt_char_t * p_component, const kt_char_t * p_category_name, kt_uint32_t level);

/* Sets the sink that gets all events from now on, instead of the file; NULL goes back to the environment's choice. On
 * return the former sink isn't running in any thread, and won't be called again, so its token may be released. Hence
 * it waits for events under way, and must not be called with a lock held that the sink takes. Inside a sink it has no
 * effect. */
void tr_set_sink_1(tr_sink_t * p_sink, void * p_token);

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif

#endif
