// SPDX-License-Identifier: MIT
// trace: see trace.h.
#include "support/trace.h"

#include "kt_rg.h"

namespace kt_test
{

namespace
{

void set_levels(std::uint32_t api_level, std::uint32_t errors_level)
{
    tr_set_level_1("_RGA", "API", api_level);
    tr_set_level_1("_RGA", "Errors", errors_level);
}

std::string copied(const char * p)
{
    return p == nullptr ? "" : p;
}

event copied(const tr_event_t & from)
{
    event to{from.kind, copied(from.p_component), from.id, {}, {}, copied(from.p_function), copied(from.p_source_file),
             from.line, copied(from.p_text)};
    if (from.kind == TR_EVENT_VALUES)
        to.values.assign(from.p_values, from.p_values + from.count);
    if (from.kind == TR_EVENT_STRINGS)
        to.strings.assign(from.p_strings, from.p_strings + from.count);
    return to;
}

} // namespace

trace_catcher::trace_catcher(std::uint32_t api_level, std::uint32_t errors_level)
{
    rg_opaque_handle_t tree = nullptr;
    if (rg_open_tree_1(&tree, 0, 0) == 0)
        rg_close_tree_1(tree);
    tr_set_sink_1(sink, this);
    set_levels(api_level, errors_level);
}

trace_catcher::~trace_catcher()
{
    set_levels(0, 0);
    tr_set_sink_1(nullptr, nullptr);
}

void trace_catcher::sink(void * p_token, const tr_event_t * p_event)
{
    auto * const p_catcher = static_cast<trace_catcher *>(p_token);
    if (p_event->kind == TR_EVENT_FORMATTED)
        return;
    const event caught = copied(*p_event);
    p_catcher->events_.push_back(caught);
    if (p_catcher->action_)
        p_catcher->action_(caught);
}

} // namespace kt_test
