// SPDX-License-Identifier: MIT
// columns: the columns of a table as ktrg reads and writes them: `name:type[:flags][=default]`.
//
// The text form is what `schema` prints and `create` and `import --types` accept, so one is the other's inverse. Types
// are int32 uint32 int64 uint64 float32 float64 string binary handle sbs struct(name:type,...), with [] behind one for
// an array. Flags are key (refuses a second row with the same key), multikey (doesn't), protected, invisible and reset
// (takes its default again in an update that doesn't name it).
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "kt_rg.h"

namespace ktrg
{

struct column_field {
    std::string    name;
    kt_data_type_t type = KT_UNKNOWN;
};

struct column {
    std::string               name;
    kt_data_type_t            type       = KT_UNKNOWN;
    rg_qualifier_t            qualifier  = RG_STANDARD;
    kt_int32_t                properties = 0;
    std::vector<column_field> fields;       // of structured data
    std::string               default_text; // empty: the type's empty value

    [[nodiscard]] bool is_key() const
    {
        return (qualifier & 15) == RG_PRIMARY_KEY || (qualifier & 15) == RG_PRIMARY_KEY_NOCHECK;
    }
};

// Types that the text of a value tells apart.
[[nodiscard]] constexpr bool is_signed(kt_data_type_t type)
{
    return type == KT_INT32 || type == KT_INT64;
}
[[nodiscard]] constexpr bool is_unsigned(kt_data_type_t type)
{
    return type == KT_UINT32 || type == KT_UINT64;
}
[[nodiscard]] constexpr bool is_float(kt_data_type_t type)
{
    return type == KT_FLOAT32 || type == KT_FLOAT64;
}
[[nodiscard]] constexpr bool is_number(kt_data_type_t type)
{
    return type >= KT_INT32 && type <= KT_FLOAT64;
}
[[nodiscard]] constexpr bool is_array(kt_data_type_t type)
{
    return type >= KT_INT32_ARRAY && type <= KT_SD_PTR_ARRAY;
}
[[nodiscard]] constexpr bool is_indirect(kt_data_type_t type)
{
    return type >= KT_CHAR_PTR && type <= KT_SD_PTR_ARRAY;
}
// Whether the number is a type at all.
[[nodiscard]] constexpr bool is_value_type(kt_data_type_t type)
{
    return type >= KT_INT32 && type <= KT_SD_PTR_ARRAY;
}
[[nodiscard]] constexpr bool can_be_key(kt_data_type_t type)
{
    return is_number(type) || type == KT_CHAR_PTR || type == KT_RSRC_HANDLE_PTR;
}
// The type of an array's elements.
[[nodiscard]] kt_data_type_t element_type(kt_data_type_t array_type);

// `uint32`, `string[]`, `struct(a:int32,b:string)`.
[[nodiscard]] std::string type_name(kt_data_type_t type, const std::vector<column_field> & fields = {});

// The type that the text names, with the fields of a struct. Throws a usage failure.
[[nodiscard]] kt_data_type_t parse_type(std::string_view text, std::vector<column_field> * p_fields);

// The names of a column's flags, in the order of the text form.
[[nodiscard]] std::vector<std::string> flag_names(const column & of);

[[nodiscard]] std::string column_text(const column & of);
[[nodiscard]] column      parse_column(std::string_view text);
// Several of them, with commas between.
[[nodiscard]] std::vector<column> parse_columns(std::string_view text);

// Whether the registry takes the name: a letter, then letters, digits and '_', 255 at most.
[[nodiscard]] bool is_column_name(std::string_view name);

// The failure for an update of a column that is protected. `context` goes in front of the text if it isn't empty.
class failure;
[[nodiscard]] failure protected_column(const column & of, std::string_view table_name, std::string_view context = {});

// The position of the column, or a failure that suggests the nearest name.
[[nodiscard]] std::size_t              find_column(const std::vector<column> & columns, std::string_view name,
                                                   std::string_view table_name);
[[nodiscard]] std::vector<std::string> column_names(const std::vector<column> & columns);

} // namespace ktrg
