// SPDX-License-Identifier: MIT
// column_definitions: see its header.
#include "column_definitions.h"

#include <cstddef>

#include <fmt/format.h>

#include "failure.h"
#include "tree.h"

namespace ktrg
{

namespace
{

kt_value_t default_of(const column & of, const std::string & subject, value_arena & arena)
{
    try {
        return parse_value(of.type, of.fields, of.default_text, arena);
    } catch (const failure & what) {
        throw failure(exit_code::usage, subject, fmt::format("the default of \"{}\": {}", of.name, what.text()),
                      RG_E_INVALID_COLUMN);
    }
}

} // namespace

column_definitions::column_definitions(const std::vector<column> & columns, const std::string & subject)
    : columns_(columns)
{
    for (const column & each : columns_) {
        rg_column_t definition{};
        definition.name       = writable(each.name);
        definition.type       = each.type;
        definition.qualifier  = each.qualifier;
        definition.properties = each.properties;
        if (!each.fields.empty())
            definition.sd_defn = make_fields(each);
        if (!each.default_text.empty())
            definition.default_value = default_of(each, subject, arena_);
        definitions_.push_back(definition);
    }
}

rg_sd_def_t * column_definitions::make_fields(const column & of)
{
    auto * p_definition = static_cast<rg_sd_def_t *>(
        arena_.allocate(offsetof(rg_sd_def_t, fields) + of.fields.size() * sizeof(rg_field_def_t)));
    p_definition->number_of_fields = static_cast<kt_uint32_t>(of.fields.size());
    for (std::size_t i = 0; i < of.fields.size(); i++)
        p_definition->fields[i] = {of.fields[i].type, writable(of.fields[i].name)};
    return p_definition;
}

} // namespace ktrg
