// SPDX-License-Identifier: MIT
// type_detection: see its header.
#include "type_detection.h"

#include <nlohmann/json.hpp>

#include "values.h"

namespace ktrg
{

void type_detector::look_at(std::string_view text)
{
    std::int64_t  integer = 0;
    std::uint64_t natural = 0;
    double        real    = 0;
    any_                  = true;
    all_int64_            = all_int64_ && parse_int64(text, integer);
    all_uint64_           = all_uint64_ && parse_uint64(text, natural);
    all_float64_          = all_float64_ && parse_float64(text, real);
    any_digits_           = any_digits_ || text.find_first_of("0123456789") != std::string_view::npos;
}

void type_detector::look_at(const text_cell & cell)
{
    if (cell.kind == text_kind::nested) {
        look_at_array(cell.text);
        return;
    }
    any_scalar_ = true;
    any_string_ = any_string_ || cell.kind == text_kind::string;
    look_at(cell.text);
}

void type_detector::look_at_array(std::string_view text)
{
    const auto array = nlohmann::json::parse(text, nullptr, false);
    any_array_       = true;
    if (!array.is_array()) {
        unknown_ = true;
        return;
    }
    for (const auto & element : array) {
        if (element.is_string()) {
            any_        = true;
            any_string_ = true;
        } else if (element.is_number()) {
            any_bare_ = true;
            look_at(element.dump());
        } else {
            unknown_ = true;
        }
    }
}

kt_data_type_t type_detector::scalar_type() const
{
    if (!any_ || any_string_)
        return KT_CHAR_PTR;
    if (all_int64_)
        return KT_INT64;
    if (all_uint64_)
        return KT_UINT64;
    return all_float64_ && any_digits_ ? KT_FLOAT64 : KT_CHAR_PTR;
}

kt_data_type_t type_detector::type() const
{
    if (!any_array_)
        return scalar_type();
    if (unknown_ || any_scalar_ || (any_string_ && any_bare_))
        return KT_UNKNOWN;
    switch (scalar_type()) {
    case KT_INT64:
        return KT_INT64_ARRAY;
    case KT_UINT64:
        return KT_UINT64_ARRAY;
    case KT_FLOAT64:
        return KT_FLOAT64_ARRAY;
    default:
        return KT_CHAR_PTR_ARRAY;
    }
}

} // namespace ktrg
