// SPDX-License-Identifier: MIT
// rg_i_messages: the texts of the library's messages, at compile time: for the built-in table, for the lookup of a
// code's message, and for the program that writes the source of the catalog.
#pragma once

#include <cstddef>
#include <iterator>
#include <string_view>

#include "kt_rg.h"

struct rg_i_message_t {
    kt_int32_t        index;
    kt_int32_t        code;
    const kt_char_t * p_text;
};

inline constexpr rg_i_message_t RG_I_MESSAGES[] = {
#define MESSAGE(index, code, text) {index, code, text},
#include "rg_i_messages.inc"
#undef MESSAGE
};

inline constexpr kt_char_t  RG_I_MESSAGE_CATALOG[] = "kt_rg.cat";
inline constexpr kt_int32_t RG_I_MESSAGE_SET       = 1;

extern const kt_char_t ku_badid_kt_rg_set[]; // for a message layer that meets an index outside the set

// The indices that something refers to by number.
enum {
    RG_I_MESSAGE_SYSTEM_CALL            = 1,
    RG_I_MESSAGE_LIBRARY_CALL           = 2,
    RG_I_MESSAGE_NO_MEMORY              = 3,
    RG_I_MESSAGE_INTERNAL               = 6,
    RG_I_MESSAGE_INVALID_PATH           = 9,
    RG_I_MESSAGE_INVALID_VARIABLE       = 16,
    RG_I_MESSAGE_NO_SUCH_KEY            = 19,
    RG_I_MESSAGE_FILESYSTEM_FULL_DETAIL = 30,
    RG_I_MESSAGE_NO_SUCH_KEY_DETAIL     = 31
};

namespace rg_i_messages_check
{

constexpr bool each_stands_at_its_index()
{
    for (size_t i = 0; i < std::size(RG_I_MESSAGES); ++i)
        if (RG_I_MESSAGES[i].index != static_cast<kt_int32_t>(i))
            return false;
    return true;
}

constexpr bool each_but_the_filler_ends_its_line()
{
    for (const rg_i_message_t & message : RG_I_MESSAGES)
        if (std::string_view(message.p_text).ends_with('\n') != (message.index != 0))
            return false;
    return true;
}

// "2605-ccc " with the code in three digits.
constexpr kt_int32_t number_in(std::string_view text)
{
    return (text[5] - '0') * 100 + (text[6] - '0') * 10 + (text[7] - '0');
}

constexpr bool each_text_carries_its_code()
{
    for (const rg_i_message_t & message : RG_I_MESSAGES)
        if (message.index != 0 && message.index != RG_I_MESSAGE_NO_SUCH_KEY_DETAIL &&
            number_in(message.p_text) != message.code)
            return false;
    return true;
}

static_assert(std::size(RG_I_MESSAGES) == RG_TOTAL_MESSAGES);
static_assert(each_stands_at_its_index());
static_assert(each_but_the_filler_ends_its_line());
static_assert(each_text_carries_its_code());
static_assert(number_in(RG_I_MESSAGES[RG_I_MESSAGE_NO_SUCH_KEY_DETAIL].p_text) == 213);

} // namespace rg_i_messages_check
