// SPDX-License-Identifier: MIT
// type_detection: see its header.
#include "type_detection.h"

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

kt_data_type_t type_detector::type() const
{
    if (!any_)
        return KT_CHAR_PTR;
    if (all_int64_)
        return KT_INT64;
    if (all_uint64_)
        return KT_UINT64;
    return all_float64_ && any_digits_ ? KT_FLOAT64 : KT_CHAR_PTR;
}

} // namespace ktrg
