// `flvdmx plot`: bit rate, keyframes and interleaving over time, as a drawing.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/input.h"
#include "tools/output_file.h"
#include "tools/played.h"
#include "tools/report.h"
#include "tools/svg.h"
#include "tools/timeline.h"

namespace tool {

namespace {

constexpr double WIDTH = 1040;
constexpr double LEFT = 90;
constexpr double RIGHT = WIDTH - 30;
constexpr double TOP = 100;
constexpr double LARGE = 210;   // height of a diagram
constexpr double SMALL = 120;   // of the last one
constexpr double DISTANCE = 78; // between diagrams, for labels and heading
constexpr double STRIP = 16;    // height of the keyframe marks
constexpr double MARKS_LEGEND = 26;
constexpr int MOST_TIME_TICKS = 12;
constexpr size_t COLUMNS = 460; // one point of a line every two pixels
constexpr double BITS_PER_BYTE = 8;

constexpr const char* STYLE =
    "text{font:13px 'DejaVu Sans',Verdana,Arial,sans-serif;fill:#333}"
    ".title{font-size:19px;font-weight:bold}.about,.tick{font-size:12px;fill:#666}.heading{font-size:14px;font-weight:"
    "bold}"
    ".left,.legend{text-anchor:end}.mid{text-anchor:middle}"
    "line{stroke:#e4e4e4}.axis{stroke:#777}"
    "path{fill:none;stroke-linejoin:round}"
    ".video{stroke:#1f6fb4;stroke-width:1.6}.audio{stroke:#dd7715;stroke-width:1.6}"
    ".area-video{fill:#1f6fb4;fill-opacity:.16}.area-audio{fill:#dd7715;fill-opacity:.22}"
    ".dots{stroke-dasharray:5 4}.keyframe{stroke:#b3304a}.lead{fill:#5b8c3a;fill-opacity:.35;stroke:#5b8c3a}"
    ".gap{stroke:#8a8a8a;fill:#8a8a8a;fill-opacity:.2;stroke-width:.5}"
    ".damage{stroke:#d02020;fill:#d02020;fill-opacity:.2}"
    ".jump{stroke:#7a3fb0;stroke-width:1.4;stroke-dasharray:2 3}";

struct Unit {
    double size;
    const char* name;
};

// The largest unit that is not larger than the value.
const Unit& UnitFor(const std::vector<Unit>& units, double value)
{
    const auto fits = [value](const Unit& unit) { return value >= unit.size; };
    const auto found = std::find_if(units.begin(), units.end(), fits);
    return found != units.end() ? *found : units.back();
}

const std::vector<Unit> RATE_UNITS = {{1e6, "Mbit/s"}, {1e3, "kbit/s"}, {1, "bit/s"}};
const std::vector<Unit> BYTE_UNITS = {{1e9, "GB"}, {1e6, "MB"}, {1e3, "kB"}, {1, "bytes"}};
const std::vector<Unit> LEAD_UNITS = {{1, "s"}, {1e-3, "ms"}};

std::string Amount(const std::vector<Unit>& units, double value)
{
    const Unit& unit = UnitFor(units, value);
    return fmt::format("{:.3g} {}", value / unit.size, unit.name);
}

const char* ClassOf(Mark::Kind kind)
{
    return kind == Mark::Kind::gap ? "gap" : kind == Mark::Kind::damage ? "damage" : "jump";
}

class Plot {
public:
    Plot(const Input& input, const Timeline& timeline)
        : m_input(input), m_timeline(timeline),
          m_both(HasVideo() && HasAudio()), m_time{0, timeline.duration, LEFT, RIGHT},
          m_svg(WIDTH, Height(), STYLE, input.name)
    {
    }

    std::string Draw()
    {
        DrawTitle();
        DrawRates(TOP);
        if (m_both) {
            const double top = TOP + LARGE + DISTANCE + STRIP;
            DrawPositions(top);
            DrawLead(top + LARGE + DISTANCE);
        }
        return m_svg.Document();
    }

private:
    bool HasVideo() const { return m_input.info.video.has_value(); }
    bool HasAudio() const { return m_input.info.audio.has_value(); }

    double Height() const
    {
        constexpr double BOTTOM = 60; // includes the legend of the marks
        return TOP + LARGE + (HasVideo() ? STRIP : 0) + (m_both ? DISTANCE + LARGE + DISTANCE + SMALL : 0) + BOTTOM +
               (m_timeline.marks.empty() ? 0 : MARKS_LEGEND);
    }

    std::string StreamText(const StreamTimeline& stream, const std::string& codec) const
    {
        const double rate = static_cast<double>(stream.bytes) * BITS_PER_BYTE / m_timeline.duration;
        return fmt::format(" \u00b7 {}, {}, {}", codec, Plural(stream.frames, "frame"), Amount(RATE_UNITS, rate));
    }

    void DrawTitle()
    {
        constexpr size_t TITLE_COLUMNS = 76; // fit even if all letters are wide
        constexpr size_t ABOUT_COLUMNS = 130;
        const std::string name = std::filesystem::path(m_input.name).filename().string();
        m_svg.Text(LEFT, 34, "title", Shorten(Printable(name), TITLE_COLUMNS));
        std::string about = fmt::format("{} \u00b7 {}", FormatTime(m_timeline.durationMs),
                                        Amount(BYTE_UNITS, static_cast<double>(m_input.info.size)));
        if (HasVideo())
            about += StreamText(m_timeline.video, flvdmx::name(m_input.info.video->codec));
        if (HasAudio())
            about += StreamText(m_timeline.audio, flvdmx::name(m_input.info.audio->codec));
        m_svg.Text(LEFT, 55, "about", Shorten(about, ABOUT_COLUMNS));
        DrawMarksLegend(Height() - 14);
    }

    // Explains the marks, below the diagrams.
    void DrawMarksLegend(double y)
    {
        std::vector<std::pair<const char*, std::string>> entries;
        const auto any = [this](Mark::Kind kind) {
            return std::any_of(m_timeline.marks.begin(), m_timeline.marks.end(),
                               [kind](const Mark& mark) { return mark.kind == kind; });
        };
        if (any(Mark::Kind::gap))
            entries.emplace_back("gap", "no frames");
        if (any(Mark::Kind::damage))
            entries.emplace_back("damage", fmt::format("{} bytes skipped", m_timeline.bytesSkipped));
        if (any(Mark::Kind::jump))
            entries.emplace_back("jump", "timestamps jump");
        DrawLegend(y, entries);
    }

    // Draws each kind as one path, so that thousands of marks do not become thousands of elements.
    void DrawMarks(double top, double bottom)
    {
        constexpr double LEAST_WIDTH = 1;
        for (const Mark::Kind kind : {Mark::Kind::gap, Mark::Kind::damage, Mark::Kind::jump}) {
            std::string path;
            for (const Mark& mark : m_timeline.marks) {
                const double x = m_time.At(mark.from);
                if (mark.kind != kind)
                    continue;
                if (kind == Mark::Kind::jump)
                    path += fmt::format("M{:.1f} {}V{}", x, top, bottom);
                else
                    path += fmt::format("M{:.1f} {}V{}h{:.1f}V{}Z", x, top, bottom,
                                        std::max(m_time.At(mark.to) - x, LEAST_WIDTH), top);
            }
            if (!path.empty())
                m_svg.Add("<path class=\"{}\" d=\"{}\"/>", ClassOf(kind), path);
        }
    }

    // Draws the grid, ticks and labels. @return the axis of the values, which ends at the tick above the highest
    Axis DrawFrame(double top, double height, const std::string& heading, const std::vector<Unit>& units, double low,
                   double high, double below = 0)
    {
        const int mostTicks = height < LARGE ? 4 : 6;
        const double step = RoundStep(std::max(high - low, units.back().size), mostTicks);
        const Axis values{std::floor(low / step) * step, std::max(std::ceil(high / step), low < 0 ? 0.0 : 1.0) * step,
                          top + height, top};
        const Unit& unit = UnitFor(units, std::max(values.high, -values.low));
        const int64_t ticks = std::llround((values.high - values.low) / step);
        for (int64_t i = 0; i <= ticks; ++i) {
            const double value = values.low + static_cast<double>(i) * step;
            m_svg.Line(LEFT, values.At(value), RIGHT, values.At(value), "grid");
            const double shown = std::abs(value) < step / 2 ? 0 : value / unit.size; // no -0
            m_svg.Text(LEFT - 8, values.At(value) + 4, "tick left", fmt::format("{:.4g}", shown));
        }
        DrawTimeTicks(top, top + height + below);
        m_svg.Line(LEFT, top, LEFT, top + height + below, "axis");
        m_svg.Line(LEFT, top + height, RIGHT, top + height, "axis");
        m_svg.Text(LEFT, top - 12, "heading", fmt::format("{} ({})", heading, unit.name));
        DrawMarks(top, top + height);
        return values;
    }

    void DrawTimeTicks(double top, double bottom)
    {
        const double step = TimeStep(m_timeline.duration, MOST_TIME_TICKS);
        const auto ticks = static_cast<int64_t>(m_timeline.duration / step * 1.0001);
        for (int64_t i = 0; i <= ticks; ++i) {
            const double time = static_cast<double>(i) * step;
            m_svg.Line(m_time.At(time), top, m_time.At(time), bottom + 5, "grid");
            m_svg.Text(m_time.At(time), bottom + 20, "tick mid", TimeLabel(time, m_timeline.duration, step));
        }
    }

    // Draws entries from right to left, the last one first.
    void DrawLegend(double y, const std::vector<std::pair<const char*, std::string>>& entries)
    {
        constexpr double CHARACTER = 7.6;
        double x = RIGHT;
        for (auto entry = entries.rbegin(); entry != entries.rend(); ++entry) {
            m_svg.Text(x, y, "legend", entry->second);
            x -= static_cast<double>(entry->second.size()) * CHARACTER;
            m_svg.Add("<path class=\"{}\" d=\"M{:.1f} {:.1f}h22\" style=\"stroke-width:3\"/>", entry->first, x - 28,
                      y - 4);
            x -= 46;
        }
    }

    std::vector<std::pair<const char*, std::string>> StreamLegend(const char* audioKind) const
    {
        std::vector<std::pair<const char*, std::string>> entries;
        if (HasVideo())
            entries.emplace_back("video", "video");
        if (HasAudio())
            entries.emplace_back(audioKind, "audio");
        return entries;
    }

    // The last interval ends where the file ends.
    double EndOf(size_t i) const
    {
        return i + 1 == m_timeline.video.bits.size() ? m_timeline.duration
                                                     : static_cast<double>(i + 1) * m_timeline.interval;
    }

    double RateOf(const StreamTimeline& stream, size_t i) const
    {
        return stream.bits[i] / (EndOf(i) - static_cast<double>(i) * m_timeline.interval);
    }

    double HighestRate() const
    {
        double highest = 1;
        for (const StreamTimeline* const stream : {&m_timeline.video, &m_timeline.audio}) {
            for (size_t i = 0; i < stream->bits.size(); ++i)
                highest = std::max(highest, RateOf(*stream, i));
        }
        return highest;
    }

    void DrawRates(double top)
    {
        const Axis values = DrawFrame(top, LARGE, fmt::format("Bit rate over {:.3g} s", m_timeline.interval),
                                      RATE_UNITS, 0, HighestRate(), HasVideo() ? STRIP : 0);
        auto legend = StreamLegend("audio");
        if (HasVideo())
            DrawRate(values, m_timeline.video, "video");
        if (HasAudio())
            DrawRate(values, m_timeline.audio, "audio");
        if (HasVideo()) {
            DrawKeyframes(top + LARGE);
            legend.emplace_back("keyframe", Plural(m_timeline.keyframes.size(), "keyframe"));
        }
        DrawLegend(top - 12, legend);
    }

    // The line breaks where frames are missing for a whole interval.
    void DrawRate(const Axis& values, const StreamTimeline& stream, const char* kind)
    {
        std::string line;
        std::string area;
        bool open = false;
        for (size_t i = 0; i < stream.bits.size(); ++i) {
            const double begin = static_cast<double>(i) * m_timeline.interval;
            const bool missing = stream.bits[i] == 0 && m_timeline.IsMissing(begin, EndOf(i));
            if (open && missing)
                area += fmt::format("V{}Z", values.from);
            if (!open && !missing) {
                line += fmt::format("M{:.1f} {:.1f}", m_time.At(begin), values.At(RateOf(stream, i)));
                area += fmt::format("M{:.1f} {}", m_time.At(begin), values.from);
            }
            open = !missing;
            const std::string step = fmt::format("V{:.1f}H{:.1f}", values.At(RateOf(stream, i)), m_time.At(EndOf(i)));
            line += open ? step : "";
            area += open ? step : "";
        }
        if (open)
            area += fmt::format("V{}Z", values.from);
        m_svg.Add("<path class=\"area-{}\" d=\"{}\"/>", kind, area);
        m_svg.Add("<path class=\"{}\" d=\"{}\"/>", kind, line);
    }

    // Draws one mark per keyframe. If they would touch, one mark covers a few pixels, and is the taller the more
    // keyframes it stands for.
    void DrawKeyframes(double top)
    {
        constexpr double CELL = 4; // pixels
        constexpr auto CELLS = static_cast<size_t>((RIGHT - LEFT) / CELL);
        constexpr double HEIGHT = STRIP - 2;
        const auto x = [this](double time) { return m_time.At(std::clamp(time, 0.0, m_timeline.duration)); };
        std::string marks;
        if (m_timeline.keyframes.size() <= CELLS) {
            for (const double time : m_timeline.keyframes)
                marks += fmt::format("M{:.2f} {}v{}", x(time), top + 2, HEIGHT);
        } else {
            std::vector<double> counts(CELLS);
            for (const double time : m_timeline.keyframes)
                ++counts[std::min(static_cast<size_t>((x(time) - LEFT) / CELL), CELLS - 1)];
            const double most = *std::max_element(counts.begin(), counts.end());
            for (size_t i = 0; i < CELLS; ++i)
                if (counts[i] > 0)
                    marks += fmt::format("M{:.2f} {}v-{:.1f}", LEFT + (static_cast<double>(i) + 0.5) * CELL,
                                         top + STRIP, std::max(counts[i] / most * HEIGHT, 2.0));
        }
        m_svg.Add("<path class=\"keyframe\" id=\"keyframes\" style=\"stroke-width:1.6\" d=\"{}\"/>", marks);
    }

    double ColumnX(size_t column) const
    {
        return m_time.At((static_cast<double>(column) + 0.5) * m_timeline.duration / static_cast<double>(COLUMNS));
    }

    void DrawPositions(double top)
    {
        const Axis values = DrawFrame(top, LARGE, "Interleaving: position in the file", BYTE_UNITS, 0,
                                      static_cast<double>(m_input.Instance().data_end));
        DrawPosition(values, m_timeline.video, "video");
        DrawPosition(values, m_timeline.audio, "audio dots");
        DrawLegend(top - 12, StreamLegend("audio dots"));
    }

    void DrawPosition(const Axis& values, const StreamTimeline& stream, const char* kind)
    {
        std::string points;
        for (size_t column = 0; column < COLUMNS; ++column) {
            const Range& range = stream.positions[column];
            if (range.IsEmpty())
                continue;
            const char move = points.empty() || range.breaks ? 'M' : 'L';
            points += fmt::format("{}{:.1f} {:.1f}", move, ColumnX(column), values.At(range.low));
            points += fmt::format("V{:.1f}", values.At(range.high));
        }
        m_svg.Add("<path class=\"{}\" d=\"{}\"/>", kind, points.empty() ? "M0 0" : points);
    }

    void DrawLead(double top)
    {
        Range all{0, 0};
        for (const Range& range : m_timeline.lead) {
            if (!range.IsEmpty()) {
                all.Take(range.low);
                all.Take(range.high);
            }
        }
        const Axis values = DrawFrame(top, SMALL, "Interleaving: audio ahead of video", LEAD_UNITS, all.low, all.high);
        m_svg.Line(LEFT, values.At(0), RIGHT, values.At(0), "axis");
        std::string bands;
        std::string upper;
        std::string lower;
        for (size_t column = 0; column < COLUMNS; ++column) {
            const Range& range = m_timeline.lead[column];
            if (range.IsEmpty())
                continue;
            if (range.breaks && !upper.empty())
                bands += std::exchange(upper, "") + std::exchange(lower, "") + 'Z';
            upper += fmt::format("{}{:.1f} {:.1f}", upper.empty() ? 'M' : 'L', ColumnX(column), values.At(range.high));
            lower.insert(0, fmt::format("L{:.1f} {:.1f}", ColumnX(column), values.At(range.low)));
        }
        if (!upper.empty())
            m_svg.Add("<path class=\"lead\" d=\"{}{}{}Z\"/>", bands, upper, lower);
        DrawLegend(top - 12, {{"lead", "minimum to maximum"}});
    }

    const Input& m_input;
    const Timeline& m_timeline;
    const bool m_both;
    const Axis m_time;
    Svg m_svg;
};

} // namespace

int RunPlot(const PlotOptions& options)
{
    std::string extension = std::filesystem::path(options.out).extension().string();
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char c) { return std::tolower(c); });
    for (const char* const picture : {".png", ".jpg", ".jpeg", ".gif", ".webp", ".bmp", ".pdf"})
        if (extension == picture)
            throw FileError(options.out, "the drawing is an SVG file: use a name that ends in .svg");
    Input input(options.file);
    input.WarnIfCutShort();
    WarnOfUnplayed(input);
    OutputFile file(options.out, options.file, options.force);
    input.file.accept_all_times();
    const Timeline timeline = ReadTimeline(input, COLUMNS);
    if (timeline.video.frames + timeline.audio.frames == 0)
        throw FileError(options.file, "there are no frames to draw");
    file.Write(Plot(input, timeline).Draw());
    file.Finish();
    return DONE;
}

} // namespace tool
