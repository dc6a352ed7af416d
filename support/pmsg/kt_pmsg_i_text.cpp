// SPDX-License-Identifier: MIT
// kt_pmsg_i_text: the strings of one value on their way through a conversion handle. See kt_pmsg_i_text.h.
//
// Layer: value library. Calls the string conversion of the utility library; called by building and reading.
// Locking: none; a text_conversion belongs to one call.
// Failure: what was kept so far stays kept until the call ends and frees it.
#include "kt_pmsg_i_text.h"

#include <algorithm>

namespace kt_pmsg_i
{

kt_int32_t convert_text(ku_iconv_t * p_handle, const char * p_string, char ** p_p_text, std::uint64_t * p_length)
{
    kt_uint32_t   input_size  = 0; // up to the terminator
    kt_uint32_t   output_size = 0;
    kt_char_ptr_t p_text      = nullptr;
    if (const kt_int32_t rc = ku_iconv_str_1(p_handle, 0, p_string, &input_size, &p_text, &output_size); rc != 0)
        return rc == KU_E_NO_MEMORY ? KT_PMSG_E_NO_MEMORY : KT_PMSG_E_CONVERSION;
    // Strings end at their first zero byte. A code set whose characters hold one would lose the rest.
    if (std::strlen(p_text) != output_size) {
        std::free(p_text);
        return KT_PMSG_E_CONVERSION;
    }
    *p_p_text = p_text;
    *p_length = std::uint64_t{output_size} + 1;
    return 0;
}

kt_int32_t text_conversion::keep(const char * p_string, std::uint64_t * p_length)
{
    char * p_text = nullptr;
    if (const kt_int32_t rc = convert_text(p_handle_, p_string, &p_text, p_length); rc != 0)
        return rc;

    const std::size_t length = *p_length;
    if (length > capacity_ - length_) {
        const std::size_t new_capacity = std::max(length_ + length, capacity_ * 2);
        char * const      p_grown      = static_cast<char *>(std::realloc(p_kept_, new_capacity));
        if (p_grown == nullptr) {
            std::free(p_text);
            return KT_PMSG_E_NO_MEMORY;
        }
        p_kept_   = p_grown;
        capacity_ = new_capacity;
    }
    std::memcpy(p_kept_ + length_, p_text, length);
    length_ += length;
    std::free(p_text);
    return 0;
}

} // namespace kt_pmsg_i
