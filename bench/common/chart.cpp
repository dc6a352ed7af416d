// SPDX-License-Identifier: MIT
#include "common/chart.h"

#include <algorithm>
#include <cmath>
#include <string_view>

#include <fmt/os.h>

namespace bench
{

namespace
{

// Pixels.
constexpr double width  = 760; // or more, for long labels
constexpr double height = 400;
constexpr double left   = 76;
constexpr double right  = 560; // of the plot; behind it stand the labels
constexpr double top    = 64;
constexpr double bottom = 360;
constexpr double letter = 15; // least distance of two labels

// A viewer's ground is light or dark; what isn't a line takes its colour from it.
constexpr std::string_view style = R"(<style>
text { font: 12px system-ui, sans-serif; fill: #57606a; }
.title { font-size: 15px; font-weight: 600; fill: #1f2328; }
.grid { stroke: #d0d7de; stroke-width: 1; }
.line { fill: none; stroke-linejoin: round; stroke-linecap: round; }
@media (prefers-color-scheme: dark) {
text { fill: #9198a1; }
.title { fill: #f0f6fc; }
.grid { stroke: #3d444d; }
}
</style>
)";

// A logarithmic axis between two places on the picture.
class axis
{
  public:
    axis(double least, double most, double from, double to)
        : least_(std::log10(least)), most_(std::log10(most)), from_(from), to_(to)
    {
    }

    [[nodiscard]] double at(double value) const
    {
        return most_ == least_ ? (from_ + to_) / 2
                               : from_ + (std::log10(value) - least_) / (most_ - least_) * (to_ - from_);
    }

    // The powers of ten on it; with fine ticks, where they are few, also the twos and fives between them.
    [[nodiscard]] std::vector<double> ticks(bool fine) const
    {
        std::vector<double> all;
        const bool          few = fine && most_ - least_ < 2.5;
        for (double power = std::floor(least_); power <= most_; ++power)
            for (const double factor : {1.0, 2.0, 5.0}) {
                const double value = factor * std::pow(10, power);
                if ((factor == 1 || few) && std::log10(value) >= least_ - 1e-9 && std::log10(value) <= most_ + 1e-9)
                    all.push_back(value);
            }
        return all;
    }

  private:
    double least_;
    double most_;
    double from_;
    double to_;
};

// The axes that all points lie on, with some room above and below.
std::pair<axis, axis> axes_of(const chart & c)
{
    double x_least = c.lines[0].points[0].first;
    double x_most  = x_least;
    double y_least = c.lines[0].points[0].second;
    double y_most  = y_least;
    for (const line & l : c.lines)
        for (const auto & [x, y] : l.points) {
            x_least = std::min(x_least, x);
            x_most  = std::max(x_most, x);
            y_least = std::min(y_least, y);
            y_most  = std::max(y_most, y);
        }
    return {axis(x_least, x_most, left, right), axis(y_least / 1.3, y_most * 1.3, bottom, top)};
}

std::string escaped(const std::string & text)
{
    std::string result;
    for (const char letter_of_it : text)
        result += letter_of_it == '<' ? "&lt;" : letter_of_it == '&' ? "&amp;" : std::string(1, letter_of_it);
    return result;
}

// Wide enough for the labels and the figures behind them.
double width_of(const chart & c)
{
    constexpr double a_letter = 7.5;
    double           widest   = width;
    for (const line & l : c.lines)
        if (!l.label.empty()) {
            const std::size_t letters = l.label.size() + 1 + c.figure_text(l.points.back().second).size();
            widest                    = std::max(widest, right + 22 + a_letter * static_cast<double>(letters));
        }
    return widest;
}

void draw_grid(fmt::ostream & out, const chart & c, const axis & x, const axis & y)
{
    for (const double value : y.ticks(true)) {
        const double at = y.at(value);
        out.print("<line class='grid' x1='{:.1f}' x2='{:.1f}' y1='{:.1f}' y2='{:.1f}'/>\n", left, right, at, at);
        out.print("<text x='{:.1f}' y='{:.1f}' text-anchor='end'>{}</text>\n", left - 8, at + 4, c.y_text(value));
    }
    for (const double value : x.ticks(false)) {
        const double at = x.at(value);
        out.print("<line class='grid' x1='{:.1f}' x2='{:.1f}' y1='{:.1f}' y2='{:.1f}'/>\n", at, at, top, bottom);
        out.print("<text x='{:.1f}' y='{:.1f}' text-anchor='middle'>{}</text>\n", at, bottom + 18, c.x_text(value));
    }
}

void draw_line(fmt::ostream & out, const line & l, const axis & x, const axis & y)
{
    std::string points;
    for (const auto & [at_x, at_y] : l.points)
        points += fmt::format("{:.1f},{:.1f} ", x.at(at_x), y.at(at_y));
    const std::string dashes = l.dashes.empty() ? "" : fmt::format(" stroke-dasharray='{}'", l.dashes);
    out.print("<polyline class='line' stroke='{}' stroke-width='{}'{} points='{}'/>\n", l.color, l.width, dashes,
              points);
    for (const auto & [at_x, at_y] : l.points)
        out.print("<circle cx='{:.1f}' cy='{:.1f}' r='{}' fill='{}'/>\n", x.at(at_x), y.at(at_y), l.width + 0.5,
                  l.color);
}

// The places of the lines' labels: at their ends, moved apart where they would cover each other.
std::vector<std::pair<const line *, double>> label_places(const chart & c, const axis & y)
{
    std::vector<std::pair<const line *, double>> places;
    for (const line & l : c.lines)
        if (!l.label.empty())
            places.emplace_back(&l, y.at(l.points.back().second));
    std::sort(places.begin(), places.end(), [](const auto & a, const auto & b) { return a.second < b.second; });
    double least = top;
    for (auto & [p_line, at] : places) {
        at    = std::max(at, least);
        least = at + letter;
    }
    double most = bottom;
    for (auto place = places.rbegin(); place != places.rend(); ++place) {
        place->second = std::min(place->second, most);
        most          = place->second - letter;
    }
    return places;
}

void draw_labels(fmt::ostream & out, const chart & c, const axis & x, const axis & y)
{
    for (const auto & [p_line, at] : label_places(c, y)) {
        const auto & [end_x, end_y] = p_line->points.back();
        out.print(
            "<line stroke='{}' stroke-width='1' opacity='0.5' x1='{:.1f}' y1='{:.1f}' x2='{:.1f}' y2='{:.1f}'/>\n",
            p_line->color, x.at(end_x) + 4, y.at(end_y), right + 18, at);
        out.print("<text x='{:.1f}' y='{:.1f}'><tspan style='fill:{};font-weight:600'>{}</tspan> {}</text>\n",
                  right + 22, at + 4, p_line->color, p_line->label, c.figure_text(end_y));
    }
}

} // namespace

void write_svg(const chart & c, const std::string & path)
{
    const auto [x, y] = axes_of(c);
    auto out          = fmt::output_file(path);
    out.print("<svg xmlns='http://www.w3.org/2000/svg' width='{0}' height='{1}' viewBox='0 0 {0} {1}'>\n", width_of(c),
              height);
    out.print("<!-- SPDX-License-Identifier: MIT -->\n{}", style);
    out.print("<text class='title' x='16' y='26'>{}</text>\n", escaped(c.title));
    out.print("<text x='16' y='46'>{}</text>\n", escaped(c.subtitle));
    draw_grid(out, c, x, y);
    for (const line & l : c.lines)
        draw_line(out, l, x, y);
    draw_labels(out, c, x, y);
    out.print("<text x='{:.1f}' y='{:.1f}' text-anchor='middle'>rows</text>\n</svg>\n", (left + right) / 2,
              bottom + 36);
}

} // namespace bench
