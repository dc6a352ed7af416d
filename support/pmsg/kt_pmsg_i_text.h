// SPDX-License-Identifier: MIT
// kt_pmsg_i_text: the strings of one value on their way through a conversion handle.
//
// Building and reading make two passes: the first finds all that can fail and the room needed, the second copies. Each
// string is converted in the first pass and kept here until the second one takes it, in the same order. With a handle
// that changes nothing there is nothing to keep, and both passes look at the string itself.
#pragma once

#include <cstdlib>
#include <utility>

#include "kt_pmsg_i_forms.h"

namespace kt_pmsg_i
{

// Converts one terminated string. *p_p_text is malloc'ed and terminated, *p_length counts the terminator.
[[nodiscard]] kt_int32_t convert_text(ku_iconv_t * p_handle, const char * p_string, char ** p_p_text,
                                      std::uint64_t * p_length);

class text_conversion
{
  public:
    explicit text_conversion(ku_iconv_t * p_handle)
        : p_handle_(p_handle == nullptr || ku_iconv_is_identity_1(p_handle) != 0 ? nullptr : p_handle)
    {
    }
    ~text_conversion() { std::free(p_kept_); }
    text_conversion(const text_conversion &)             = delete;
    text_conversion & operator=(const text_conversion &) = delete;

    [[nodiscard]] bool         is_identity() const { return p_handle_ == nullptr; }
    [[nodiscard]] ku_iconv_t * handle() const { return p_handle_; }

    // First pass: the length of the converted string with its terminator. source_length counts the terminator too.
    [[nodiscard]] kt_int32_t measure(const std::byte * p_string, std::uint64_t source_length, std::uint64_t * p_length)
    {
        if (is_identity()) {
            *p_length = source_length;
            return 0;
        }
        return keep(reinterpret_cast<const char *>(p_string), p_length);
    }

    // Second pass: copies the next string to p_to and returns its length with the terminator.
    std::size_t take(std::byte * p_to, const std::byte * p_string)
    {
        const std::byte * p_text = p_string;
        if (!is_identity())
            p_text = reinterpret_cast<const std::byte *>(p_kept_ + taken_);
        const std::size_t length = std::strlen(reinterpret_cast<const char *>(p_text)) + 1;
        std::memcpy(p_to, p_text, length);
        taken_ += length;
        return length;
    }

  private:
    [[nodiscard]] kt_int32_t keep(const char * p_string, std::uint64_t * p_length);

    ku_iconv_t * p_handle_; // NULL: strings go through unchanged
    char *       p_kept_   = nullptr;
    std::size_t  length_   = 0;
    std::size_t  capacity_ = 0;
    std::size_t  taken_    = 0;
};

} // namespace kt_pmsg_i
