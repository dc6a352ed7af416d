// SPDX-License-Identifier: MIT
// rg_i_client_value: client values that the value library made of a buffer's items: who releases them, and what may be
// taken from them. An item is well formed by then, but it needn't be what the format asks for at that place: elements
// are looked at by number and type before their values are used.
#pragma once

#include <cstdlib>

#include "kt_pmsg.h"

// A client value of an indirect type, which is one block.
class owned_client_value
{
  public:
    owned_client_value() = default;
    ~owned_client_value() { std::free(value_.ptr_char); }
    owned_client_value(const owned_client_value &)             = delete;
    owned_client_value & operator=(const owned_client_value &) = delete;

    // Makes the value of a stored one. Only while it owns nothing. Returns the value library's code.
    [[nodiscard]] kt_int32_t read(kt_data_type_t type, const void * p_slot, const void * p_indirect_data,
                                  kt_pmsg_len_t indirect_data_bound)
    {
        return kt_pmsg_build_conv_packed_client_value_1(nullptr, 0, type, &value_, p_slot, p_indirect_data,
                                                        indirect_data_bound);
    }
    [[nodiscard]] const kt_value_t & get() const { return value_; }
    // The block has another owner now.
    void release() { value_.ptr_char = nullptr; }

  private:
    kt_value_t value_ = {.ptr_char = nullptr};
};

// The elements, which go on behind the record as it is declared.
[[nodiscard]] inline const kt_structured_data_element_t * rg_i_client_elements(const kt_structured_data_t * p_sd)
{
    return p_sd->elements;
}

[[nodiscard]] inline const kt_value_t * rg_i_client_elements(const kt_array_t * p_array)
{
    return p_array->elements;
}

// An element of an array of structured data.
[[nodiscard]] inline const kt_structured_data_t * rg_i_client_sd(const kt_array_t * p_array, kt_uint32_t index)
{
    return rg_i_client_elements(p_array)[index].ptr_sd;
}

[[nodiscard]] inline bool rg_i_client_has_element(const kt_structured_data_t * p_sd, kt_uint32_t index,
                                                  kt_data_type_t type)
{
    return index < p_sd->element_count && rg_i_client_elements(p_sd)[index].data_type == type;
}

[[nodiscard]] inline kt_uint32_t rg_i_client_uint32(const kt_structured_data_t * p_sd, kt_uint32_t index)
{
    return rg_i_client_elements(p_sd)[index].value.val_uint32;
}
