// SPDX-License-Identifier: MIT
// schema_output: see its header.
#include "schema_output.h"

#include <nlohmann/json.hpp>

#include "utf8.h"

namespace ktrg
{

namespace
{

using json = nlohmann::ordered_json;

json json_of(const column & from)
{
    json result     = json::object();
    result["name"]  = from.name;
    result["type"]  = type_name(from.type, from.fields);
    result["key"]   = from.is_key();
    result["flags"] = json::array();
    for (const std::string & name : flag_names(from))
        result["flags"].push_back(name);
    result["default"] = from.default_text.empty() ? json() : json(escaped_bytes(from.default_text));
    if (from.properties != 0)
        result["properties"] = from.properties;
    if (!from.fields.empty()) {
        json fields = json::array();
        for (const column_field & field : from.fields)
            fields.push_back({{"name", field.name}, {"type", type_name(field.type)}});
        result["fields"] = fields;
    }
    return result;
}

void write_json(output_sink & sink, const place & where, const std::vector<column> & columns)
{
    json result       = json::object();
    result["table"]   = where.name;
    result["key"]     = columns.front().name;
    result["columns"] = json::array();
    for (const column & each : columns)
        result["columns"].push_back(json_of(each));
    sink.write(result.dump(1, ' ', false, json::error_handler_t::replace) + "\n");
}

void write_rows(output_sink & sink, const output_style & style, const std::vector<column> & columns)
{
    const auto writer = make_row_writer(style, sink);
    writer->begin({{"name", false}, {"type", false}, {"flags", false}, {"default", false}});
    for (const column & each : columns) {
        std::string flags;
        for (const std::string & name : flag_names(each))
            flags += (flags.empty() ? "" : " ") + name;
        writer->row({cell::of_text(each.name), cell::of_text(type_name(each.type, each.fields)),
                     flags.empty() ? cell{} : cell::of_text(flags),
                     each.default_text.empty() ? cell{} : cell::of_text(each.default_text)});
    }
    writer->end();
}

} // namespace

void write_schema(const common_options & common, const place & where, const std::vector<column> & columns)
{
    output_sink sink;
    if (!common.form.has_value()) {
        for (const column & each : columns)
            sink.write(escaped_for_display(column_text(each)) + "\n");
    } else if (*common.form == output_form::json) {
        write_json(sink, where, columns);
    } else {
        write_rows(sink, common.style_or(output_form::table), columns);
    }
    sink.flush();
}

} // namespace ktrg
