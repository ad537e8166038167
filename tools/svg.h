// A drawing in SVG, and the axes of its diagrams.
#ifndef FLVDMX_TOOLS_SVG_H
#define FLVDMX_TOOLS_SVG_H

#include <string>
#include <string_view>

#include <fmt/format.h>

namespace tool {

/** @return the printable text with XML's reserved characters escaped */
std::string XmlText(std::string_view text);

/** Builds a document from elements. */
class Svg {
public:
    Svg(double width, double height, std::string_view style, std::string_view title);

    /** Adds an element in fmt's notation. */
    template <typename... Arguments> void Add(fmt::format_string<Arguments...> format, Arguments&&... arguments)
    {
        m_text += fmt::format(format, std::forward<Arguments>(arguments)...) + "\n";
    }
    void Line(double x1, double y1, double x2, double y2, const char* kind);
    void Text(double x, double y, const char* kind, std::string_view text);

    /** @return the whole document */
    std::string Document() const { return m_text + "</svg>\n"; }

private:
    std::string m_text;
};

/** A range of values and the pixels that it is drawn to. */
struct Axis {
    double low;
    double high;
    double from; /**< pixel of low */
    double to;   /**< pixel of high */

    double At(double value) const { return from + (value - low) / (high - low) * (to - from); }
};

/** @return a round distance of ticks (1, 2 or 5 times a power of ten), so that at most `most` fit the range */
double RoundStep(double range, int most);

/** @return the same for times in seconds, where minutes and hours count as round */
double TimeStep(double seconds, int most);

/** @return the label of a time on an axis of this length and distance of ticks, all in seconds */
std::string TimeLabel(double seconds, double range, double step);

} // namespace tool

#endif
