// SPDX-License-Identifier: MIT
// ku_values: the class table of the data types, the shared empty values, and the comparison of resource handles.
//
// Always holds: what stands here is constant and lives in read-only memory. A caller who writes through one of the
// shared empty values is stopped by the machine; nobody frees them.
#include "kt_ku.h"

#include <cstring>

namespace
{

const kt_char_t            empty_text[1]  = {'\0'};
const kt_binary_t          empty_binary   = {0, {0}};
const kt_resource_handle_t invalid_handle = {0, {0, 0, 0, 0}};
const kt_structured_data_t empty_sd       = {0, 0, {{KT_UNKNOWN, 0, {}}}};

// Stands for arrays and, having a leading 32-bit 0, for a self-describing byte string of no fields too.
const kt_array_t empty_array = {0, 0, {{}}};

kt_uint32_t word_at(const void * p_handle, size_t index)
{
    kt_uint32_t word = 0;
    std::memcpy(&word, static_cast<const char *>(p_handle) + index * sizeof word, sizeof word);
    return word;
}

} // namespace

extern "C" const kt_uint32_t ku_dtc_table_1[KU_DTC_TYPES] = {0,                // KT_UNKNOWN
                                                             0,                // KT_NONE
                                                             0,                // KT_INT32
                                                             0,                // KT_UINT32
                                                             0,                // KT_INT64
                                                             0,                // KT_UINT64
                                                             0,                // KT_FLOAT32
                                                             0,                // KT_FLOAT64
                                                             KU_DTC_INDIRECT,  // KT_CHAR_PTR
                                                             KU_DTC_INDIRECT,  // KT_BINARY_PTR
                                                             KU_DTC_INDIRECT,  // KT_RSRC_HANDLE_PTR
                                                             KU_DTC_INDIRECT,  // KT_SD_PTR
                                                             KU_DTC_INDIRECT,  // KT_SBS_PTR
                                                             KU_DTC_INDIRECT,  // KT_INT32_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_UINT32_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_INT64_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_UINT64_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_FLOAT32_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_FLOAT64_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_CHAR_PTR_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_BINARY_PTR_ARRAY
                                                             KU_DTC_INDIRECT,  // KT_RSRC_HANDLE_PTR_ARRAY
                                                             KU_DTC_INDIRECT}; // KT_SD_PTR_ARRAY

static_assert(KU_DTC_TYPES == KT_SD_PTR_ARRAY + 1, "one entry for each data type, in their order");

extern "C" {
const kt_char_ptr_t            ku_ptr_empty_char_1      = const_cast<kt_char_ptr_t>(empty_text);
const kt_binary_ptr_t          ku_ptr_empty_binary_1    = const_cast<kt_binary_ptr_t>(&empty_binary);
const kt_resource_handle_ptr_t ku_ptr_invld_rsrc_hndl_1 = const_cast<kt_resource_handle_ptr_t>(&invalid_handle);
const kt_sd_ptr_t              ku_ptr_empty_sd_1        = const_cast<kt_sd_ptr_t>(&empty_sd);
const kt_array_ptr_t           ku_ptr_empty_array_1     = const_cast<kt_array_ptr_t>(&empty_array);
}

extern "C" kt_int32_t ku_rsrc_hndl_cmp_1(void * p_handle1, void * p_handle2)
{
    constexpr size_t words = sizeof(kt_resource_handle_t) / sizeof(kt_uint32_t);
    for (size_t i = 0; i < words; i++) {
        const kt_uint32_t word1 = word_at(p_handle1, i);
        const kt_uint32_t word2 = word_at(p_handle2, i);
        if (word1 != word2)
            return word1 < word2 ? -1 : 1;
    }
    return 0;
}
