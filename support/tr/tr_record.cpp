// SPDX-License-Identifier: MIT
// tr_record: the calls by which a component makes an event.
//
// Always holds: without a sink and without a level ever set, a call is a load and a branch; its arguments are not
// looked at. Events use the stack alone and keep errno, so they may be made under any lock and on any path.
// Failure: none. What doesn't fit (values beyond 64, strings beyond 32, text beyond 2 KiB) is left out.
#include "tr_components.h"
#include "tr_output.h"

#include <cstdarg>
#include <cstdio>

namespace
{

constexpr kt_uint32_t most_values  = 64;
constexpr kt_uint32_t most_strings = 32;
constexpr size_t      longest_text = 2048;

inline bool nobody_wants_events()
{
    return __builtin_expect(Tr_I_Wanted.load(std::memory_order_relaxed) == 0, 1);
}

// A sink gets every event; lines are for components with a level. Formatting waits for this answer.
bool is_wanted(const kt_char_t * p_component)
{
    return p_component != nullptr && ((Tr_I_Wanted.load(std::memory_order_relaxed) & TR_I_SINK_IS_SET) != 0 ||
                                      tr_i_component_is_traced(p_component));
}

tr_event_t new_event(tr_event_kind_t kind, const kt_char_t * p_component, kt_uint32_t id)
{
    tr_event_t event    = {};
    event.kind          = kind;
    event.p_component   = p_component;
    event.id            = id;
    event.p_function    = "";
    event.p_source_file = "";
    event.p_text        = "";
    return event;
}

} // namespace

extern "C" void tr_record_id_1(const kt_char_t * p_component, kt_uint32_t id)
{
    if (nobody_wants_events() || !is_wanted(p_component))
        return;
    tr_event_t event = new_event(TR_EVENT_ID, p_component, id);
    tr_i_deliver(event);
}

extern "C" void tr_record_values_32_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...)
{
    if (nobody_wants_events() || !is_wanted(p_component))
        return;
    kt_uint32_t values[most_values];
    tr_event_t  event = new_event(TR_EVENT_VALUES, p_component, id);
    event.count       = count < most_values ? count : most_values;
    event.p_values    = values;
    va_list arguments;
    va_start(arguments, count);
    for (kt_uint32_t i = 0; i < event.count; i++)
        values[i] = va_arg(arguments, kt_uint32_t);
    va_end(arguments);
    tr_i_deliver(event);
}

extern "C" void tr_record_strings_1(const kt_char_t * p_component, kt_uint32_t id, kt_uint32_t count, ...)
{
    if (nobody_wants_events() || !is_wanted(p_component))
        return;
    const kt_char_t * strings[most_strings];
    tr_event_t        event = new_event(TR_EVENT_STRINGS, p_component, id);
    event.count             = count < most_strings ? count : most_strings;
    event.p_strings         = strings;
    va_list arguments;
    va_start(arguments, count);
    for (kt_uint32_t i = 0; i < event.count; i++)
        strings[i] = va_arg(arguments, const kt_char_t *);
    va_end(arguments);
    tr_i_deliver(event);
}

// Kept because callers depend on it: an error's category is passed as 0, whatever its number, and the event's id is 0.
extern "C" void tr_record_error_1(const kt_char_t * p_component, kt_uint32_t, const kt_char_t * p_function,
                                  kt_uint32_t line, const kt_char_t * p_source_file, kt_uint32_t)
{
    if (nobody_wants_events() || !is_wanted(p_component))
        return;
    tr_event_t event    = new_event(TR_EVENT_ERROR, p_component, 0);
    event.p_function    = p_function != nullptr ? p_function : "";
    event.p_source_file = p_source_file != nullptr ? p_source_file : "";
    event.line          = line;
    tr_i_deliver(event);
}

extern "C" void tr_record_fmt_string_1(const kt_char_t * p_component, kt_uint32_t category, const kt_char_t * p_format,
                                       ...)
{
    if (nobody_wants_events() || !is_wanted(p_component) || p_format == nullptr)
        return;
    char    text[longest_text];
    va_list arguments;
    va_start(arguments, p_format);
    if (vsnprintf(text, sizeof text, p_format, arguments) < 0)
        text[0] = '\0';
    va_end(arguments);
    tr_event_t event = new_event(TR_EVENT_FORMATTED, p_component, category);
    event.p_text     = text;
    tr_i_deliver(event);
}
