// SPDX-License-Identifier: MIT
// ku_locale: what the process's locale is, as far as the libraries ask.
//
// Always holds: each thing delivered is one block from malloc, so releasing needs no counts. The locales of categories
// and the texts of items stand in one block with the array that points to them.
// Failure: nothing is delivered, and all outputs are NULL.
#include "kt_ku.h"

#include <langinfo.h>
#include <locale.h>

#include <cstdlib>
#include <cstring>
#include <utility>

namespace
{

const kt_char_t * locale_of_category(kt_int32_t category)
{
    return setlocale(category, nullptr);
}

const kt_char_t * text_of_item(kt_int32_t item)
{
    return nl_langinfo(item);
}

// Copies the numbers asked for, and delivers their texts behind an array of pointers, in one block.
kt_int32_t deliver(kt_uint32_t count, const kt_int32_t * p_asked, kt_int32_t ** p_p_list, kt_char_ptr_t ** p_p_texts,
                   const kt_char_t * (*p_text_of)(kt_int32_t))
{
    if (count == 0)
        return 0;
    if (p_asked == nullptr)
        return KU_E_INVALID_ARGUMENT;

    size_t bytes = count * sizeof(kt_char_ptr_t);
    for (kt_uint32_t i = 0; i < count; i++) {
        const kt_char_t * p_text = p_text_of(p_asked[i]);
        if (p_text == nullptr)
            return KU_E_INVALID_ARGUMENT;
        bytes += std::strlen(p_text) + 1;
    }
    auto * const p_list  = static_cast<kt_int32_t *>(std::malloc(count * sizeof(kt_int32_t)));
    auto * const p_texts = static_cast<kt_char_ptr_t *>(std::malloc(bytes));
    if (p_list == nullptr || p_texts == nullptr) {
        std::free(p_list);
        std::free(p_texts);
        return KU_E_NO_MEMORY;
    }

    std::memcpy(p_list, p_asked, count * sizeof(kt_int32_t));
    kt_char_ptr_t p_to = reinterpret_cast<kt_char_ptr_t>(p_texts + count);
    for (kt_uint32_t i = 0; i < count; i++) {
        const kt_char_t * p_text = p_text_of(p_asked[i]);
        const size_t      size   = std::strlen(p_text) + 1;
        std::memcpy(p_to, p_text, size);
        p_texts[i] = p_to;
        p_to += size;
    }
    *p_p_list  = p_list;
    *p_p_texts = p_texts;
    return 0;
}

template <class T> void release(T ** p_p_block)
{
    std::free(*p_p_block);
    *p_p_block = nullptr;
}

} // namespace

extern "C" kt_int32_t ku_get_locale_info_1(kt_uint32_t * p_category_count, kt_int32_t ** p_p_category_list,
                                           kt_char_ptr_t ** p_p_category_locales, kt_uint32_t * p_item_count,
                                           kt_int32_t ** p_p_item_list, kt_char_ptr_t ** p_p_item_langinfo,
                                           kt_char_ptr_t * p_p_codeset)
{
    if (p_category_count == nullptr || p_p_category_list == nullptr || p_p_category_locales == nullptr ||
        p_item_count == nullptr || p_p_item_list == nullptr || p_p_item_langinfo == nullptr || p_p_codeset == nullptr)
        return KU_E_INVALID_ARGUMENT;
    const kt_int32_t * p_asked_categories = std::exchange(*p_p_category_list, nullptr);
    const kt_int32_t * p_asked_items      = std::exchange(*p_p_item_list, nullptr);
    *p_p_category_locales                 = nullptr;
    *p_p_item_langinfo                    = nullptr;
    *p_p_codeset                          = nullptr;

    kt_int32_t rc =
        deliver(*p_category_count, p_asked_categories, p_p_category_list, p_p_category_locales, locale_of_category);
    if (rc == 0)
        rc = deliver(*p_item_count, p_asked_items, p_p_item_list, p_p_item_langinfo, text_of_item);
    if (rc == 0) {
        *p_p_codeset = strdup(nl_langinfo(CODESET));
        if (*p_p_codeset != nullptr)
            return 0;
        rc = KU_E_NO_MEMORY;
    }
    release(p_p_category_list);
    release(p_p_category_locales);
    release(p_p_item_list);
    release(p_p_item_langinfo);
    return rc;
}

extern "C" void ku_rel_locale_info_1(kt_int32_t * p_category_list, kt_char_ptr_t * p_category_locales,
                                     kt_int32_t * p_item_list, kt_char_ptr_t * p_item_langinfo, kt_char_ptr_t p_codeset)
{
    std::free(p_category_list);
    std::free(p_category_locales);
    std::free(p_item_list);
    std::free(p_item_langinfo);
    std::free(p_codeset);
}
