// SPDX-License-Identifier: MIT
// tr_line: an event as a line of text.
//
//     4711.000123456 2001 _RGA id 5
//     4711.000123999 2001 _RGA values 6: 0
//     4711.000124011 2001 _RGA strings 120: "key" "/table"
//     4711.000124500 2001 _RGA error 0: rg_i_open_table at rg_i_open_table.cpp:312
//     4711.000125000 2001 _RGA text 4294967295: DV|COM|...
//
// Seconds of the monotonic clock, the thread's number, the component, the event. Control characters in texts become
// '?', so that an event is one line; a line is cut at 4 KiB.
// Always holds: one event, one write, so that lines of several threads and processes don't mix in a file.
// Failure: the line is lost. A file that can't be opened is replaced by standard error.
#include "tr_output.h"

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>

namespace
{

constexpr size_t longest_line = 4096;
constexpr int    not_opened   = -1;

std::atomic<int> Trace_Fd{not_opened};

// Two threads may both find it unopened: the first one's descriptor stays.
int trace_fd()
{
    const int fd = Trace_Fd.load(std::memory_order_acquire);
    if (fd != not_opened)
        return fd;
    const char * p_path = secure_getenv("KT_TRACE_FILE");
    int          opened = p_path != nullptr && *p_path != '\0'
                              ? open(p_path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC | O_NOCTTY, 0644)
                              : STDERR_FILENO;
    if (opened < 0)
        opened = STDERR_FILENO;
    int expected = not_opened;
    if (Trace_Fd.compare_exchange_strong(expected, opened, std::memory_order_acq_rel))
        return opened;
    if (opened != STDERR_FILENO)
        close(opened);
    return expected;
}

// Appends until it is full; one byte always stays for the newline.
class line_writer
{
  public:
    __attribute__((format(printf, 2, 3))) void add(const char * p_format, ...)
    {
        va_list arguments;
        va_start(arguments, p_format);
        const size_t room   = longest_line - 1 - used_;
        const int    length = vsnprintf(line_ + used_, room + 1, p_format, arguments);
        va_end(arguments);
        if (length > 0)
            used_ += static_cast<size_t>(length) < room ? static_cast<size_t>(length) : room;
    }

    void finish(int fd)
    {
        for (size_t i = 0; i < used_; i++) {
            if (static_cast<unsigned char>(line_[i]) < ' ' || line_[i] == '\x7F')
                line_[i] = '?';
        }
        line_[used_] = '\n';
        // A trace that can't be written must not disturb what it watches.
        [[maybe_unused]] const ssize_t ignored = write(fd, line_, used_ + 1);
    }

  private:
    char   line_[longest_line];
    size_t used_ = 0;
};

void add_content(line_writer & line, const tr_event_t & event)
{
    switch (event.kind) {
    case TR_EVENT_ID:
        line.add("id %u", event.id);
        break;
    case TR_EVENT_VALUES:
        line.add("values %u:", event.id);
        for (kt_uint32_t i = 0; i < event.count; i++)
            line.add(" %u", event.p_values[i]);
        break;
    case TR_EVENT_STRINGS:
        line.add("strings %u:", event.id);
        for (kt_uint32_t i = 0; i < event.count; i++)
            line.add(" \"%s\"", event.p_strings[i] != nullptr ? event.p_strings[i] : "");
        break;
    case TR_EVENT_ERROR:
        line.add("error %u: %s at %s:%u", event.id, event.p_function, event.p_source_file, event.line);
        break;
    case TR_EVENT_FORMATTED:
        line.add("text %u: %s", event.id, event.p_text);
        break;
    }
}

} // namespace

void tr_i_write_line(const tr_event_t & event)
{
    line_writer line;
    line.add("%llu.%09llu %llu %s ", static_cast<unsigned long long>(event.nanoseconds / 1000000000),
             static_cast<unsigned long long>(event.nanoseconds % 1000000000),
             static_cast<unsigned long long>(event.thread), event.p_component);
    add_content(line, event);
    line.finish(trace_fd());
}
