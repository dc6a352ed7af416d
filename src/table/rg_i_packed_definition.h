// SPDX-License-Identifier: MIT
// rg_i_packed_definition: a walk over the structured data definition of a column, as the metadata record holds it.
//
// There sd_defn leads to the packed form: the number of fields, and then for each field its type and its terminated
// name, one behind the other with no alignment. Creation writes it and opening checks it, so the walk needs no bound.
#pragma once

#include <cstring>

#include "rg_i_table.h"

struct rg_i_packed_field_t {
    kt_data_type_t    type;
    const kt_char_t * p_name;
};

[[nodiscard]] inline kt_uint32_t rg_i_packed_definition_fields(const rg_sd_def_t * p_sd_defn)
{
    return rg_i_load_u32(p_sd_defn);
}

// Calls action(position, field) for each field, for as long as it returns true.
template <class Action> void rg_i_for_each_packed_field(const rg_sd_def_t * p_sd_defn, Action action)
{
    const kt_uint32_t fields = rg_i_packed_definition_fields(p_sd_defn);
    const kt_char_t * p      = reinterpret_cast<const kt_char_t *>(p_sd_defn) + sizeof fields;
    for (kt_uint32_t position = 0; position < fields; ++position) {
        const rg_i_packed_field_t field{rg_i_load_u32(p), p + sizeof(kt_data_type_t)};
        if (!action(position, field))
            return;
        p = field.p_name + std::strlen(field.p_name) + 1;
    }
}
