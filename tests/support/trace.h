// SPDX-License-Identifier: MIT
// trace: catches the trace events of a stretch of a test.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "kt_tr.h"

namespace kt_test
{

// An event, with everything that it points to copied.
struct event {
    tr_event_kind_t            kind;
    std::string                component;
    std::uint32_t              id;
    std::vector<std::uint32_t> values;
    std::vector<std::string>   strings;
    std::string                function;
    std::string                source_file;
    std::uint32_t              line;
    std::string                text;
};

// Sets the sink and the level bytes of the component's categories API and Errors, and restores both at the end. One at
// a time. Opens a tree first if the process has none yet, since a component without registration has no levels.
class trace_catcher
{
  public:
    trace_catcher(std::uint32_t api_level, std::uint32_t errors_level);
    ~trace_catcher();
    trace_catcher(const trace_catcher &)             = delete;
    trace_catcher & operator=(const trace_catcher &) = delete;

    // Runs on each event, inside the call that makes it.
    void on_event(std::function<void(const event &)> action) { action_ = std::move(action); }
    void clear() { events_.clear(); }
    // All but the development lines.
    const std::vector<event> & events() const { return events_; }

  private:
    static void sink(void * p_token, const tr_event_t * p_event);

    std::vector<event>                 events_;
    std::function<void(const event &)> action_;
};

} // namespace kt_test
