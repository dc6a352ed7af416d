// SPDX-License-Identifier: MIT
// table_model: a table as the tests of packed buffers write it down. Also for the program that exchanges buffers with a
// foreign machine, so it needs no test framework.
#pragma once

#include <map>

#include "kt_rg.h"
#include "pmsg/value_kit.h"

namespace kt_test
{

// ---- A table as a test writes it -----------------------------------------------------------------------------------

struct column_model {
    std::string                                         name;
    kt_data_type_t                                      type;
    model                                               default_value = {}; // KT_UNKNOWN: none is given
    rg_qualifier_t                                      qualifier     = RG_STANDARD;
    std::int32_t                                        properties    = 0;
    std::vector<std::pair<kt_data_type_t, std::string>> fields        = {}; // of structured data
};

struct table_model {
    std::string                     path;
    std::vector<column_model>       columns;
    std::vector<std::vector<model>> rows;
};

inline bool is_structured(kt_data_type_t type)
{
    return type == KT_SD_PTR || type == KT_SD_PTR_ARRAY;
}

inline model empty_value(kt_data_type_t type)
{
    return {.type = type};
}

// A table with a column and a value of every type, the empty values among them.
inline table_model table_of_everything(const std::string & path = "everything")
{
    table_model table{path, {{"id", KT_UINT32, a_number(KT_UINT32, 5), RG_PRIMARY_KEY, 77}}, {}};
    table.rows.resize(2);
    table.rows[0].push_back(a_number(KT_UINT32, 1000));
    table.rows[1].push_back(a_number(KT_UINT32, 2));
    std::map<kt_data_type_t, std::vector<model>> by_type;
    for (const model & m : samples())
        if (m.name != "32 levels" && m.name != "structured data of everything")
            by_type[m.type].push_back(m);
    for (kt_data_type_t type = KT_INT32; type <= KT_SD_PTR_ARRAY; ++type) {
        const std::vector<model> & values = by_type.at(type);
        column_model               column{"c" + std::to_string(type), type, values.front()};
        column.properties = static_cast<std::int32_t>(type) - 10;
        if (is_structured(type))
            column.fields = {{KT_INT32, "number"}, {KT_CHAR_PTR, "b"}, {KT_UINT64, "large"}};
        table.columns.push_back(column);
        table.rows[0].push_back(values.front());
        table.rows[1].push_back(values.back());
    }
    return table;
}

} // namespace kt_test
