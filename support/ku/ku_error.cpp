// SPDX-License-Identifier: MIT
// ku_error: the error record of each thread.
//
// The record is a few words of thread-local storage, so that clearing it, which every successful call does, is one
// store. The message has a buffer of its own, which a thread gets from the system at its first failure and gives back
// when it ends: not from malloc, which may be what has just failed.
// Always holds: p_text of the record is a readable text, whatever fails. Without a buffer it is the message's default
// text with its conversions as they stand.
// Locking: none; a thread sees its own record only.
#include "kt_ku.h"
#include "ku_catalog.h"

#include <pthread.h>
#include <sys/mman.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace
{

constexpr size_t text_size         = 12 * 1024; // two paths of 4 KiB and the longest message around them
constexpr size_t catalog_name_size = 128;

struct message_buffer {
    char text[text_size];
    char catalog[catalog_name_size];
};

struct error_record {
    kt_int32_t        code; // 0: no error stands, and the rest means nothing
    kt_int32_t        set;
    kt_int32_t        message;
    const kt_char_t * p_catalog;
    const kt_char_t * p_text;
    message_buffer *  p_buffer; // NULL until the thread's first failure
};

// In the static block, at a fixed distance from the thread pointer, also in a library that was loaded late: that block
// has little room to spare, hence no buffer here.
__attribute__((tls_model("initial-exec"))) thread_local constinit error_record Record{};

pthread_key_t Buffer_Key;
bool          Buffer_Key_Made = false;

void release_buffer(void * p_buffer)
{
    Record.code     = 0;
    Record.p_buffer = nullptr;
    munmap(p_buffer, sizeof(message_buffer));
}

__attribute__((constructor)) void make_buffer_key()
{
    Buffer_Key_Made = pthread_key_create(&Buffer_Key, release_buffer) == 0;
}

// Threads that live on have no destructor left to run; the system takes their buffers with the process.
__attribute__((destructor)) void delete_buffer_key()
{
    if (Buffer_Key_Made)
        pthread_key_delete(Buffer_Key);
    Buffer_Key_Made = false;
}

message_buffer * buffer_of_thread()
{
    if (Record.p_buffer != nullptr)
        return Record.p_buffer;
    if (!Buffer_Key_Made)
        return nullptr;
    void * p_memory = mmap(nullptr, sizeof(message_buffer), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (p_memory == MAP_FAILED)
        return nullptr;
    if (pthread_setspecific(Buffer_Key, p_memory) != 0) {
        munmap(p_memory, sizeof(message_buffer));
        return nullptr;
    }
    Record.p_buffer = static_cast<message_buffer *>(p_memory);
    return Record.p_buffer;
}

// A message that didn't fit ends at a character's border, and with the newline that all messages end with.
void end_cut_text(char * p_text)
{
    size_t end = text_size - 2;
    while (end > 0 && (static_cast<unsigned char>(p_text[end]) & 0xC0) == 0x80)
        end--;
    p_text[end]     = '\n';
    p_text[end + 1] = '\0';
}

void format_text(char * p_text, const kt_char_t * p_format, va_list arguments)
{
    const int length = vsnprintf(p_text, text_size, p_format, arguments);
    if (length < 0) {
        std::strncpy(p_text, p_format, text_size - 1);
        p_text[text_size - 1] = '\0';
    } else if (static_cast<size_t>(length) >= text_size) {
        end_cut_text(p_text);
    }
}

const kt_char_t * copy_catalog_name(char * p_to, const kt_char_t * p_catalog)
{
    if (p_catalog == nullptr)
        return "";
    const size_t length = strnlen(p_catalog, catalog_name_size - 1);
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

    if (message_buffer * p_buffer = buffer_of_thread(); p_buffer != nullptr) {
        va_list arguments;
        va_start(arguments, p_default_text);
        format_text(p_buffer->text, ku_catalog_text(p_catalog, set, message_index, p_default_text), arguments);
        va_end(arguments);
        Record.p_text    = p_buffer->text;
        Record.p_catalog = copy_catalog_name(p_buffer->catalog, p_catalog);
    } else {
        Record.p_text    = p_default_text;
        Record.p_catalog = p_catalog != nullptr ? p_catalog : "";
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
    if (Record.code == 0)
        *p_record = {0, 0, 0, "", ""};
    else
        *p_record = {Record.code, Record.set, Record.message, Record.p_catalog, Record.p_text};
}
