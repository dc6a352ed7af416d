// SPDX-License-Identifier: MIT
// chart: lines over two logarithmic axes, as an SVG file that can be read on light and on dark ground.
#ifndef BENCH_CHART_H
#define BENCH_CHART_H

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace bench
{

struct line {
    std::string                            label; // empty: none
    std::string                            color;
    std::string                            dashes; // as SVG has them; empty: none
    double                                 width;
    std::vector<std::pair<double, double>> points; // all above 0, from left to right; not empty
};

struct chart {
    std::string                        title;
    std::string                        subtitle;
    std::function<std::string(double)> x_text;
    std::function<std::string(double)> y_text; // beside the grid
    std::function<std::string(double)> figure_text;
    std::vector<line>                  lines;
};

void write_svg(const chart & c, const std::string & path);

} // namespace bench

#endif
