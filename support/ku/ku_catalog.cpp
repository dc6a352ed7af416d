// SPDX-License-Identifier: MIT
// ku_catalog: finds the translated text of a message.
//
// Always holds: a catalog is opened once for each locale that it is asked for in, and stays open; a slot is written by
// the thread that claimed it, and read by others only after it was published.
// Locking: none, so that a failure can be reported under any lock and in a child forked at any moment. Who finds a slot
// claimed and not yet published uses the default text.
// Failure: the default text.
#include "ku_catalog.h"

#include <locale.h>
#include <nl_types.h>
#include <pthread.h>

#include <atomic>
#include <cerrno>
#include <cstring>

namespace
{

constexpr size_t open_catalogs = 16;
constexpr size_t name_size     = 64;

enum slot_state : kt_uint32_t { SLOT_FREE, SLOT_CLAIMED, SLOT_PUBLISHED };

struct catalog_slot {
    std::atomic<kt_uint32_t> state;
    char                     catalog[name_size]; // constant once published, like the rest
    char                     locale[name_size];
    nl_catd                  descriptor; // no_catalog: there is none
};

catalog_slot Catalogs[open_catalogs];

const nl_catd no_catalog = reinterpret_cast<nl_catd>(-1);

bool is_plain_locale(const char * p_locale)
{
    return p_locale == nullptr || std::strcmp(p_locale, "C") == 0 || std::strcmp(p_locale, "POSIX") == 0;
}

// catopen reads files, where a thread could be cancelled and leave the slot claimed for good.
nl_catd open_catalog(const char * p_catalog)
{
    int old_state = 0;
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &old_state);
    const nl_catd descriptor = catopen(p_catalog, NL_CAT_LOCALE);
    pthread_setcancelstate(old_state, &old_state);
    return descriptor;
}

nl_catd find_catalog(const char * p_catalog, const char * p_locale)
{
    if (strnlen(p_catalog, name_size) == name_size || strnlen(p_locale, name_size) == name_size)
        return no_catalog;
    for (catalog_slot & slot : Catalogs) {
        kt_uint32_t state = slot.state.load(std::memory_order_acquire);
        if (state == SLOT_FREE && slot.state.compare_exchange_strong(state, SLOT_CLAIMED, std::memory_order_acquire)) {
            std::strcpy(slot.catalog, p_catalog);
            std::strcpy(slot.locale, p_locale);
            slot.descriptor = open_catalog(p_catalog);
            slot.state.store(SLOT_PUBLISHED, std::memory_order_release);
            return slot.descriptor;
        }
        if (state == SLOT_PUBLISHED && std::strcmp(slot.catalog, p_catalog) == 0 &&
            std::strcmp(slot.locale, p_locale) == 0)
            return slot.descriptor;
        if (state == SLOT_CLAIMED)
            return no_catalog;
    }
    return no_catalog;
}

// ---- Comparing conversions ----

constexpr size_t most_arguments = 16;

// The C type that each argument is taken as: 0 if none is. 'i', 'u' and 'x' of one length take the same type.
struct argument_types {
    kt_uint32_t type[most_arguments];
    size_t      count;
};

enum argument_class : kt_uint32_t { CLASS_INTEGER = 1, CLASS_FLOATING, CLASS_STRING, CLASS_CHARACTER, CLASS_POINTER };

kt_uint32_t class_of_conversion(char conversion)
{
    switch (conversion) {
    case 'd':
    case 'i':
    case 'u':
    case 'x':
    case 'X':
    case 'o':
        return CLASS_INTEGER;
    case 'e':
    case 'E':
    case 'f':
    case 'F':
    case 'g':
    case 'G':
        return CLASS_FLOATING;
    case 's':
        return CLASS_STRING;
    case 'c':
        return CLASS_CHARACTER;
    case 'p':
        return CLASS_POINTER;
    default:
        return 0; // above all 'n', which would write
    }
}

// Reads up to three digits; more would make a text of absurd width.
bool read_number(const char *& p, size_t & number)
{
    number = 0;
    for (int digits = 0; *p >= '0' && *p <= '9'; p++, digits++) {
        if (digits == 3)
            return false;
        number = number * 10 + static_cast<size_t>(*p - '0');
    }
    return true;
}

// A conversion from behind its '%'. A '*' for a width or a precision is refused: no message has one.
bool read_conversion(const char *& p, argument_types & arguments)
{
    size_t       number   = 0;
    size_t       position = arguments.count;
    const char * p_start  = p;
    if (!read_number(p, number))
        return false;
    if (*p == '$') {
        if (number == 0)
            return false;
        position = number - 1;
        p++;
    } else {
        p = p_start;
    }
    p += std::strspn(p, "-+ #0'");
    if (!read_number(p, number))
        return false;
    if (*p == '.') {
        p++;
        if (!read_number(p, number))
            return false;
    }
    kt_uint32_t length = 0;
    for (; *p != '\0' && std::strchr("hlqjzt", *p) != nullptr; p++)
        length = (length << 8 | static_cast<unsigned char>(*p)) & 0xFFFFFF;
    const kt_uint32_t its_class = class_of_conversion(*p);
    if (its_class == 0 || position >= most_arguments)
        return false;
    p++;

    const kt_uint32_t type = its_class << 24 | length;
    if (arguments.type[position] != 0 && arguments.type[position] != type)
        return false;
    arguments.type[position] = type;
    if (arguments.count <= position)
        arguments.count = position + 1;
    return true;
}

// Whether the text starts its conversions with a position; a text must do so in all of them or in none.
bool is_positional(const char * p)
{
    p += std::strspn(p, "0123456789");
    return *p == '$';
}

bool read_arguments(const kt_char_t * p_text, argument_types & arguments)
{
    bool first = true, positional = false;
    for (const char * p = std::strchr(p_text, '%'); p != nullptr; p = std::strchr(p, '%')) {
        p++;
        if (*p == '%') {
            p++;
            continue;
        }
        if (!first && positional != is_positional(p))
            return false;
        positional = is_positional(p);
        first      = false;
        if (!read_conversion(p, arguments))
            return false;
    }
    return true;
}

} // namespace

bool ku_conversions_match(const kt_char_t * p_text, const kt_char_t * p_default_text)
{
    argument_types of_text{}, of_default{};
    return read_arguments(p_text, of_text) && read_arguments(p_default_text, of_default) &&
           std::memcmp(&of_text, &of_default, sizeof of_text) == 0;
}

const kt_char_t * ku_catalog_text(const kt_char_t * p_catalog, kt_int32_t set, kt_int32_t message_index,
                                  const kt_char_t * p_default_text)
{
    const char * p_locale = setlocale(LC_MESSAGES, nullptr);
    if (p_catalog == nullptr || is_plain_locale(p_locale))
        return p_default_text;
    const int     saved_errno = errno;
    const nl_catd descriptor  = find_catalog(p_catalog, p_locale);
    const char *  p_text      = p_default_text;
    if (descriptor != no_catalog)
        p_text = catgets(descriptor, set, message_index, p_default_text);
    errno = saved_errno;
    return p_text == p_default_text || ku_conversions_match(p_text, p_default_text) ? p_text : p_default_text;
}
