// SPDX-License-Identifier: MIT
// ku_error: the error record of each thread.
//
// The record is a few words of thread-local storage, so that clearing it, which every successful call does, is one
// store. Its texts stand in the thread's buffer (ku_thread_buffer).
// Always holds: p_text of the record is a readable text, whatever fails. Without a buffer it is the message's default
// text with its conversions as they stand.
// Locking: none; a thread sees its own record only.
#include "kt_ku.h"
#include "ku_catalog.h"
#include "ku_thread_buffer.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace
{

struct error_record {
    kt_int32_t        code; // 0: no error stands, and the rest means nothing
    kt_int32_t        set;
    kt_int32_t        message;
    const kt_char_t * p_catalog;
    const kt_char_t * p_text;
    bool              in_buffer; // the texts are gone when the buffer is, at the thread's end
};

__attribute__((tls_model("initial-exec"))) thread_local constinit error_record Record{};

// A message that didn't fit ends with the newline that all messages end with.
void format_text(char * p_text, const kt_char_t * p_format, va_list arguments)
{
    constexpr size_t size   = ku_thread_buffer_t::message_size;
    const int        length = vsnprintf(p_text, size, p_format, arguments);
    if (length < 0) {
        std::strncpy(p_text, p_format, size - 1);
        p_text[size - 1] = '\0';
    } else if (static_cast<size_t>(length) >= size) {
        const size_t end = ku_end_at_character(p_text, size - 1);
        p_text[end]      = '\n';
        p_text[end + 1]  = '\0';
    }
}

const kt_char_t * copy_catalog_name(char * p_to, const kt_char_t * p_catalog)
{
    if (p_catalog == nullptr)
        return "";
    const size_t length = strnlen(p_catalog, ku_thread_buffer_t::catalog_size - 1);
    std::memcpy(p_to, p_catalog, length);
    p_to[length] = '\0';
    return p_to;
}

} // namespace

extern "C" void ku_set_error_1(kt_int32_t code, kt_int32_t, const kt_char_t * p_catalog, kt_int32_t set,
                               kt_int32_t message_index, const kt_char_t * p_default_text, ...)
{
    const int saved_errno = errno;
    if (p_default_text == nullptr)
        p_default_text = "";
    Record.code    = code;
    Record.set     = set;
    Record.message = message_index;

    if (ku_thread_buffer_t * p_buffer = ku_thread_buffer(); p_buffer != nullptr) {
        va_list arguments;
        va_start(arguments, p_default_text);
        format_text(p_buffer->message, ku_catalog_text(p_catalog, set, message_index, p_default_text), arguments);
        va_end(arguments);
        Record.p_text    = p_buffer->message;
        Record.p_catalog = copy_catalog_name(p_buffer->catalog, p_catalog);
        Record.in_buffer = true;
    } else {
        Record.p_text    = p_default_text;
        Record.p_catalog = p_catalog != nullptr ? p_catalog : "";
        Record.in_buffer = false;
    }
    errno = saved_errno;
}

extern "C" void ku_set_no_error_1(void)
{
    Record.code = 0;
}

extern "C" void ku_get_error_record_1(ku_error_record_t * p_record)
{
    if (p_record == nullptr)
        return;
    if (Record.code == 0 || (Record.in_buffer && !ku_thread_has_buffer()))
        *p_record = {0, 0, 0, "", ""};
    else
        *p_record = {Record.code, Record.set, Record.message, Record.p_catalog, Record.p_text};
}
