// SPDX-License-Identifier: MIT
// ku_iconv: conversion of strings between a code set and the table encoding, which is UTF-8.
//
// Always holds: a handle to a code set that needs no conversion owns no descriptor. Any other handle keeps a few idle
// descriptors; a thread takes one out for a conversion and puts it back, and opens one of its own if none is idle.
// Locking: none. A descriptor belongs to the thread that took it out of the handle by an atomic exchange, so several
// threads may use a handle at once, and a child forked in the middle of a conversion finds no lock held.
// Failure: nothing is delivered. A character that has no counterpart is a failure, never a silent loss.
#include "kt_ku.h"

#include <iconv.h>
#include <strings.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <utility>

namespace
{

constexpr size_t idle_descriptors   = 8;
constexpr size_t codeset_name_size  = 64;
constexpr size_t terminator_size    = 4; // wide enough for a code set of four-byte units
constexpr size_t longest_conversion = UINT32_MAX - terminator_size;

const iconv_t no_descriptor = nullptr; // iconv_open never gives NULL

} // namespace

struct ku_iconv_t {
    kt_int32_t           flags;    // constant after creation
    bool                 identity; // constant after creation
    char                 codeset[codeset_name_size];
    std::atomic<iconv_t> idle[idle_descriptors]; // each NULL or a descriptor that nobody uses
};

namespace
{

// The names under which the C library and people know UTF-8 and the code set of the C/POSIX locale. Every string of the
// latter is UTF-8 already, and bytes outside it come back as they went in.
constexpr const char * identity_names[] = {"UTF-8",    "UTF8",  "ANSI_X3.4-1968", "ANSI_X3.4-1986",
                                           "US-ASCII", "ASCII", "US_ASCII",       "ISO646-US",
                                           "646",      "C",     "POSIX"};

bool needs_no_conversion(const char * p_codeset)
{
    for (const char * p_name : identity_names) {
        if (strcasecmp(p_codeset, p_name) == 0)
            return true;
    }
    return false;
}

iconv_t open_descriptor(const ku_iconv_t & handle)
{
    const bool    from_table = (handle.flags & KU_ICONV_FROM_TABLE) != 0;
    const iconv_t descriptor = from_table ? iconv_open(handle.codeset, "UTF-8") : iconv_open("UTF-8", handle.codeset);
    return descriptor == reinterpret_cast<iconv_t>(-1) ? no_descriptor : descriptor;
}

iconv_t take_descriptor(ku_iconv_t & handle)
{
    for (std::atomic<iconv_t> & slot : handle.idle) {
        if (const iconv_t descriptor = slot.exchange(no_descriptor, std::memory_order_acquire);
            descriptor != no_descriptor)
            return descriptor;
    }
    return open_descriptor(handle);
}

void give_back_descriptor(ku_iconv_t & handle, iconv_t descriptor)
{
    for (std::atomic<iconv_t> & slot : handle.idle) {
        iconv_t expected = no_descriptor;
        if (slot.compare_exchange_strong(expected, descriptor, std::memory_order_release, std::memory_order_relaxed))
            return;
    }
    iconv_close(descriptor);
}

// A result under construction. Its room always has the terminator's bytes to spare.
struct growing_text {
    char * p_data = nullptr;
    size_t used   = 0;
    size_t room   = 0;

    growing_text() = default;
    ~growing_text() { std::free(p_data); }
    growing_text(const growing_text &)             = delete;
    growing_text & operator=(const growing_text &) = delete;

    [[nodiscard]] kt_int32_t grow(size_t more)
    {
        if (room + more > longest_conversion)
            return KU_E_TOO_LONG;
        char * p_larger = static_cast<char *>(std::realloc(p_data, room + more + terminator_size));
        if (p_larger == nullptr)
            return KU_E_NO_MEMORY;
        p_data = p_larger;
        room += more;
        return 0;
    }

    void deliver(kt_char_ptr_t * p_p_output, kt_uint32_t * p_output_size)
    {
        std::memset(p_data + used, 0, terminator_size);
        *p_p_output    = std::exchange(p_data, nullptr);
        *p_output_size = static_cast<kt_uint32_t>(used);
    }
};

[[nodiscard]] kt_int32_t copy_unchanged(growing_text & text, const kt_char_t * p_input, size_t size)
{
    if (const kt_int32_t rc = text.grow(size); rc != 0)
        return rc;
    if (size != 0)
        std::memcpy(text.p_data, p_input, size);
    text.used = size;
    return 0;
}

// Runs the conversion to its end; with a NULL input it writes what brings the output back to its initial state.
[[nodiscard]] kt_int32_t run(iconv_t descriptor, growing_text & text, char * p_input, size_t input_left)
{
    for (;;) {
        char *       p_to   = text.p_data + text.used;
        size_t       left   = text.room - text.used;
        const size_t result = p_input != nullptr ? iconv(descriptor, &p_input, &input_left, &p_to, &left)
                                                 : iconv(descriptor, nullptr, nullptr, &p_to, &left);
        text.used           = text.room - left;
        if (result == 0)
            return 0;
        if (result != static_cast<size_t>(-1))
            return KU_E_NO_COUNTERPART; // converted, but not reversibly: that would be a loss
        if (errno != E2BIG)
            return KU_E_NO_COUNTERPART;
        if (const kt_int32_t rc = text.grow(text.room / 2 + input_left + 16); rc != 0)
            return rc;
    }
}

[[nodiscard]] kt_int32_t convert(ku_iconv_t & handle, growing_text & text, const kt_char_t * p_input, size_t size)
{
    if (const kt_int32_t rc = text.grow(size + size / 2 + 16); rc != 0)
        return rc;
    const iconv_t descriptor = take_descriptor(handle);
    if (descriptor == no_descriptor)
        return KU_E_NO_MEMORY;

    iconv(descriptor, nullptr, nullptr, nullptr, nullptr);
    kt_int32_t rc = run(descriptor, text, const_cast<char *>(p_input), size);
    if (rc == 0)
        rc = run(descriptor, text, nullptr, 0);
    give_back_descriptor(handle, descriptor);
    return rc;
}

} // namespace

extern "C" kt_int32_t ku_utf8_is_not_modified_1(void)
{
    return 1;
}

extern "C" kt_int32_t ku_iconv_open_1(const kt_char_t * p_codeset, kt_int32_t flags, ku_iconv_t ** p_p_handle)
{
    if (p_codeset == nullptr || p_p_handle == nullptr ||
        (flags & ~(KU_ICONV_FROM_TABLE | KU_ICONV_UTF8_IS_NOT_MODIFIED)) != 0)
        return KU_E_INVALID_ARGUMENT;
    const size_t length = strnlen(p_codeset, codeset_name_size);
    // A '/' would start one of iconv's suffixes, and those lose characters silently. "" would be the locale's code set.
    if (length == 0 || length == codeset_name_size || std::strchr(p_codeset, '/') != nullptr)
        return KU_E_UNKNOWN_CODESET;

    void * p_memory = std::malloc(sizeof(ku_iconv_t));
    if (p_memory == nullptr)
        return KU_E_NO_MEMORY;
    ku_iconv_t * p_handle = new (p_memory) ku_iconv_t{};
    p_handle->flags       = flags;
    p_handle->identity    = needs_no_conversion(p_codeset);
    std::memcpy(p_handle->codeset, p_codeset, length + 1);

    if (!p_handle->identity) {
        const iconv_t descriptor = open_descriptor(*p_handle);
        if (descriptor == no_descriptor) {
            const kt_int32_t rc = errno == ENOMEM ? KU_E_NO_MEMORY : KU_E_UNKNOWN_CODESET;
            std::free(p_handle);
            return rc;
        }
        p_handle->idle[0].store(descriptor, std::memory_order_relaxed);
    }
    *p_p_handle = p_handle;
    return 0;
}

extern "C" kt_int32_t ku_iconv_close_1(ku_iconv_t * p_handle)
{
    if (p_handle == nullptr)
        return KU_E_INVALID_ARGUMENT;
    for (std::atomic<iconv_t> & slot : p_handle->idle) {
        if (const iconv_t descriptor = slot.exchange(no_descriptor); descriptor != no_descriptor)
            iconv_close(descriptor);
    }
    std::free(p_handle);
    return 0;
}

extern "C" kt_int32_t ku_iconv_str_1(ku_iconv_t * p_handle, kt_int32_t flags, const kt_char_t * p_input,
                                     kt_uint32_t * p_input_size, kt_char_ptr_t * p_p_output,
                                     kt_uint32_t * p_output_size)
{
    if (flags != 0 || p_input == nullptr || p_input_size == nullptr || p_p_output == nullptr ||
        p_output_size == nullptr)
        return KU_E_INVALID_ARGUMENT;
    const size_t size = *p_input_size != 0 ? *p_input_size : std::strlen(p_input);
    if (size > longest_conversion)
        return KU_E_TOO_LONG;

    growing_text     text;
    const kt_int32_t rc = ku_iconv_is_identity_1(p_handle) != 0 ? copy_unchanged(text, p_input, size)
                                                                : convert(*p_handle, text, p_input, size);
    if (rc != 0)
        return rc;
    text.deliver(p_p_output, p_output_size);
    return 0;
}

extern "C" kt_int32_t ku_iconv_is_identity_1(const ku_iconv_t * p_handle)
{
    return p_handle == nullptr || p_handle->identity ? 1 : 0;
}
