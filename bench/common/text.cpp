// SPDX-License-Identifier: MIT
#include "common/text.h"

#include <fmt/format.h>

namespace bench
{

std::string text_of(double value, unit in, digits shown)
{
    const auto scaled = [value, shown](double by, const char * p_unit) {
        const double v = value / by;
        if (shown == digits::needed)
            return fmt::format("{:g} {}", v, p_unit);
        return fmt::format("{:.{}f} {}", v, v < 10 ? 2 : v < 100 ? 1 : 0, p_unit);
    };
    switch (in) {
    case unit::nanoseconds:
        return value < 1e3 ? scaled(1, "ns") : value < 1e6 ? scaled(1e3, "µs") : scaled(1e6, "ms");
    case unit::bytes:
        return fmt::format("{:.0f} B", value);
    case unit::times:
        return shown == digits::needed ? fmt::format("{:g}", value) : fmt::format("{:.2f}", value);
    case unit::gigabytes_a_second:
        break;
    }
    return fmt::format("{:.1f} GB/s", value);
}

std::string with_separators(std::size_t number)
{
    return number < 1000 ? fmt::format("{}", number)
                         : fmt::format("{},{:03}", with_separators(number / 1000), number % 1000);
}

} // namespace bench
