// SPDX-License-Identifier: MIT
// rg_i_utilities: the string conversion handles of a tree.
//
// Layer: frame. Calls the utility library; called when a tree is opened.
// Always holds: both handles belong to the code set that the process's locale names at that moment.
// Locking: none: the tree isn't known to anybody yet.
// Failure: what was opened stays in its place for rg_i_close_tree to close.
#include "rg_i_trace.h"
#include "rg_i_tree.h"

namespace
{

constexpr char module_version[] = "rg_i_utilities 1.0";

// The name of the code set, with what comes along with it and has to go back together.
struct locale_info_t {
    kt_uint32_t     category_count     = 0;
    kt_int32_t *    p_category_list    = nullptr;
    kt_char_ptr_t * p_category_locales = nullptr;
    kt_uint32_t     item_count         = 0;
    kt_int32_t *    p_item_list        = nullptr;
    kt_char_ptr_t * p_item_langinfo    = nullptr;
    kt_char_ptr_t   p_codeset          = nullptr;
};

// Asks for no category and no item, so that the code set is all that comes.
[[nodiscard]] kt_int32_t get_locale_info(locale_info_t & info)
{
    const kt_int32_t result =
        ku_get_locale_info_1(&info.category_count, &info.p_category_list, &info.p_category_locales, &info.item_count,
                             &info.p_item_list, &info.p_item_langinfo, &info.p_codeset);
    // Kept because callers depend on it: the message names the call without its version, and as it was once called.
    return result == 0 ? 0 : rg_i_fail_library_call(RG_HERE, "kt_get_local_info", result);
}

void release_locale_info(const locale_info_t & info)
{
    ku_rel_locale_info_1(info.p_category_list, info.p_category_locales, info.p_item_list, info.p_item_langinfo,
                         info.p_codeset);
}

[[nodiscard]] kt_int32_t open_conversion(const kt_char_t * p_codeset, kt_int32_t flags, ku_iconv_t ** p_p_handle)
{
    const kt_int32_t result = ku_iconv_open_1(p_codeset, flags, p_p_handle);
    return result == 0 ? 0 : rg_i_fail_library_call(RG_HERE, "kt_iconv_open", result);
}

} // namespace

kt_int32_t rg_i_get_string_conversion_handles(ku_iconv_t ** p_to_table_string_conversion_handle,
                                              ku_iconv_t ** p_from_table_string_conversion_handle)
{
    locale_info_t info;
    if (const kt_int32_t rc = get_locale_info(info); rc != 0)
        return rc;

    const kt_int32_t common_flags = ku_utf8_is_not_modified_1() != 0 ? KU_ICONV_UTF8_IS_NOT_MODIFIED : 0;
    kt_int32_t       rc =
        open_conversion(info.p_codeset, KU_ICONV_TO_TABLE | common_flags, p_to_table_string_conversion_handle);
    if (rc == 0)
        rc = open_conversion(info.p_codeset, KU_ICONV_FROM_TABLE | common_flags, p_from_table_string_conversion_handle);
    release_locale_info(info);
    return rc;
}
