// SPDX-License-Identifier: MIT
// kt_pmsg_i_convert: the change of byte order in both directions. The library itself only needs the one towards the
// local order; the other makes what a foreign machine would have written.
#pragma once

#include "kt_pmsg_i_forms.h"

namespace kt_pmsg_i
{

// Reverses the slot and its item in place. The words stand in the order told before the call and in the other one
// after it. Codes as kt_pmsg_convert_pmsg_value_within_1; a failure changes nothing.
[[nodiscard]] kt_int32_t reverse_value(word_order order, void * p_slot, kt_data_type_t type, void * p_indirect_data,
                                       kt_pmsg_len_t indirect_data_bound);

} // namespace kt_pmsg_i
