// A drawing in SVG.
#include "tools/svg.h"

#include <cmath>
#include <cstdlib>

#include "tools/report.h"

namespace tool {

namespace {

constexpr double SECONDS_PER_MINUTE = 60;
constexpr double SECONDS_PER_HOUR = 3600;

} // namespace

std::string XmlText(std::string_view text)
{
    std::string escaped;
    for (const char c : Printable(text)) {
        if (c == '&')
            escaped += "&amp;";
        else if (c == '<')
            escaped += "&lt;";
        else if (c == '>')
            escaped += "&gt;";
        else
            escaped += c;
    }
    return escaped;
}

Svg::Svg(double width, double height, std::string_view style, std::string_view title)
{
    Add("<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"{0}\" height=\"{1}\" viewBox=\"0 0 {0} {1}\">", width,
        height);
    Add("<title>{}</title>\n<style>{}</style>", XmlText(title), style);
    Add("<rect width=\"{}\" height=\"{}\" fill=\"white\"/>", width, height);
}

void Svg::Line(double x1, double y1, double x2, double y2, const char* kind)
{
    Add("<line class=\"{}\" x1=\"{:.2f}\" y1=\"{:.2f}\" x2=\"{:.2f}\" y2=\"{:.2f}\"/>", kind, x1, y1, x2, y2);
}

void Svg::Text(double x, double y, const char* kind, std::string_view text)
{
    Add("<text class=\"{}\" x=\"{:.1f}\" y=\"{:.1f}\">{}</text>", kind, x, y, XmlText(text));
}

double RoundStep(double range, int most)
{
    const double least = range / most;
    const double power = std::pow(10, std::floor(std::log10(least)));
    for (const double factor : {1, 2, 5}) {
        if (power * factor >= least)
            return power * factor;
    }
    return power * 10;
}

double TimeStep(double seconds, int most)
{
    constexpr double LARGEST_DECIMAL = 5;
    if (const double step = RoundStep(seconds, most); step <= LARGEST_DECIMAL)
        return step;
    for (const double step : {10.0, 15.0, 30.0, 60.0, 120.0, 300.0, 600.0, 900.0, 1800.0}) {
        if (step * most >= seconds)
            return step;
    }
    return std::ceil(RoundStep(seconds / SECONDS_PER_HOUR, most)) * SECONDS_PER_HOUR;
}

std::string TimeLabel(double seconds, double range, double step)
{
    if (range <= SECONDS_PER_MINUTE) {
        const int digits = step >= 1 ? 0 : static_cast<int>(std::ceil(-std::log10(step)));
        return fmt::format("{:.{}f} s", seconds, digits);
    }
    const auto whole = std::lldiv(std::llround(seconds), 60);
    if (range < SECONDS_PER_HOUR)
        return fmt::format("{}:{:02}", whole.quot, whole.rem);
    return fmt::format("{}:{:02}:{:02}", whole.quot / 60, whole.quot % 60, whole.rem);
}

} // namespace tool
