// `flvdmx plot`: bit rate, keyframes and interleaving over time, as a drawing.
#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include <fmt/core.h>

#include "tools/codec_names.h"
#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/output_file.h"
#include "tools/report.h"
#include "tools/svg.h"
#include "tools/time_text.h"
#include "tools/timeline.h"

namespace tool {

namespace {

constexpr double WIDTH = 1040;
constexpr double LEFT = 90;
constexpr double RIGHT = WIDTH - 30;
constexpr double TOP = 100;
constexpr double LARGE = 210;   // height of a diagram
constexpr double SMALL = 120;   // of the last one
constexpr double DISTANCE = 78; // between two, for labels and heading
constexpr double STRIP = 16;    // height of the keyframe marks
constexpr int MOST_TIME_TICKS = 12;
constexpr size_t COLUMNS = 460; // twice the pixels between two points of a line
constexpr double BITS_A_BYTE = 8;

constexpr const char* STYLE =
    "text{font:13px 'DejaVu Sans',Verdana,Arial,sans-serif;fill:#333}"
    ".title{font-size:19px;font-weight:bold}.about,.tick{font-size:12px;fill:#666}.heading{font-size:14px;font-weight:"
    "bold}"
    ".left{text-anchor:end}.mid{text-anchor:middle}"
    "line{stroke:#e4e4e4}.axis{stroke:#777}"
    "path{fill:none;stroke-linejoin:round}"
    ".video{stroke:#1f6fb4;stroke-width:1.6}.audio{stroke:#dd7715;stroke-width:1.6}"
    ".area-video{fill:#1f6fb4;fill-opacity:.16}.area-audio{fill:#dd7715;fill-opacity:.22}"
    ".dots{stroke-dasharray:5 4}.keyframe{stroke:#b3304a}.lead{fill:#5b8c3a;fill-opacity:.35;stroke:#5b8c3a}";

struct Unit {
    double size;
    const char* name;
};

// The largest unit of which the value has at least one.
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

class Plot {
public:
    Plot(const Demuxer& demuxer, const Timeline& timeline)
        : m_demuxer(demuxer), m_timeline(timeline),
          m_both(demuxer.Video() != nullptr && demuxer.Audio() != nullptr), m_time{0, timeline.duration, LEFT, RIGHT},
          m_svg(WIDTH, Height(), STYLE, demuxer.Path())
    {
    }

    std::string Draw()
    {
        DrawTitle();
        double top = TOP;
        DrawRates(top);
        top += LARGE + DISTANCE + (HasKeyframes() ? STRIP : 0);
        DrawPositions(top);
        if (m_both)
            DrawLead(top + LARGE + DISTANCE);
        return m_svg.Document();
    }

private:
    bool HasKeyframes() const { return m_demuxer.Video() != nullptr; }

    double Height() const
    {
        constexpr double BOTTOM = 50;
        return TOP + LARGE + (HasKeyframes() ? STRIP : 0) + DISTANCE + LARGE + (m_both ? DISTANCE + SMALL : 0) + BOTTOM;
    }

    std::string StreamText(const StreamTimeline& stream, const std::string& codec) const
    {
        const double rate = static_cast<double>(stream.bytes) * BITS_A_BYTE / m_timeline.duration;
        return fmt::format(" \u00b7 {}, {} frames, {}", codec, stream.frames, Amount(RATE_UNITS, rate));
    }

    void DrawTitle()
    {
        m_svg.Text(LEFT, 34, "title", std::filesystem::path(m_demuxer.Path()).filename().string());
        std::string about = fmt::format("{} \u00b7 {}", FormatTime(m_timeline.durationMs),
                                        Amount(BYTE_UNITS, static_cast<double>(m_demuxer.Instance()->file_size)));
        if (m_demuxer.Video() != nullptr)
            about += StreamText(m_timeline.video, VideoCodec(*m_demuxer.Instance()));
        if (m_demuxer.Audio() != nullptr)
            about += StreamText(m_timeline.audio, AudioCodec(*m_demuxer.Instance()));
        m_svg.Text(LEFT, 55, "about", about);
    }

    // Grid, ticks and their labels. @return the axis of the values, which reaches to the tick above the highest
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

    // Entries from the right: the last one first.
    void DrawLegend(double y, const std::vector<std::pair<const char*, std::string>>& entries)
    {
        constexpr double CHARACTER = 7.6;
        double x = RIGHT;
        for (auto entry = entries.rbegin(); entry != entries.rend(); ++entry) {
            x -= static_cast<double>(entry->second.size()) * CHARACTER;
            m_svg.Text(x, y, "legend", entry->second);
            m_svg.Add("<path class=\"{}\" d=\"M{:.1f} {:.1f}h22\" style=\"stroke-width:3\"/>", entry->first, x - 28,
                      y - 4);
            x -= 46;
        }
    }

    std::vector<std::pair<const char*, std::string>> StreamLegend(const char* audioKind) const
    {
        std::vector<std::pair<const char*, std::string>> entries;
        if (m_demuxer.Video() != nullptr)
            entries.emplace_back("video", "video");
        if (m_demuxer.Audio() != nullptr)
            entries.emplace_back(audioKind, "audio");
        return entries;
    }

    // The last interval ends with the file.
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
                                      RATE_UNITS, 0, HighestRate(), HasKeyframes() ? STRIP : 0);
        auto legend = StreamLegend("audio");
        if (m_demuxer.Video() != nullptr)
            DrawRate(values, m_timeline.video, "video");
        if (m_demuxer.Audio() != nullptr)
            DrawRate(values, m_timeline.audio, "audio");
        if (HasKeyframes()) {
            DrawKeyframes(top + LARGE);
            legend.emplace_back("keyframe", fmt::format("keyframes ({})", m_timeline.keyframes.size()));
        }
        DrawLegend(top - 12, legend);
    }

    void DrawRate(const Axis& values, const StreamTimeline& stream, const char* kind)
    {
        std::string steps;
        for (size_t i = 0; i < stream.bits.size(); ++i)
            steps += fmt::format("V{:.1f}H{:.1f}", values.At(RateOf(stream, i)), m_time.At(EndOf(i)));
        m_svg.Add("<path class=\"area-{}\" d=\"M{} {}{}V{}Z\"/>", kind, LEFT, values.from, steps, values.from);
        m_svg.Add("<path class=\"{}\" d=\"M{} {}{}\"/>", kind, LEFT, values.At(RateOf(stream, 0)), steps);
    }

    // Many marks are drawn thin, so that a dense row still shows where one is missing.
    void DrawKeyframes(double top)
    {
        constexpr double LEAST_WIDTH = 0.12;
        constexpr double MOST_WIDTH = 2;
        constexpr double SHARE = 0.3; // of the distance
        const double distance = (RIGHT - LEFT) / static_cast<double>(m_timeline.keyframes.size() + 1);
        std::string marks;
        for (const double time : m_timeline.keyframes)
            marks +=
                fmt::format("M{:.2f} {}v{}", m_time.At(std::clamp(time, 0.0, m_timeline.duration)), top + 2, STRIP - 2);
        m_svg.Add("<path class=\"keyframe\" id=\"keyframes\" style=\"stroke-width:{:.2f}\" d=\"{}\"/>",
                  std::clamp(distance * SHARE, LEAST_WIDTH, MOST_WIDTH), marks);
    }

    double ColumnX(size_t column) const
    {
        return m_time.At((static_cast<double>(column) + 0.5) * m_timeline.duration / static_cast<double>(COLUMNS));
    }

    void DrawPositions(double top)
    {
        const Axis values = DrawFrame(top, LARGE, "Interleaving: place in the file", BYTE_UNITS, 0,
                                      static_cast<double>(m_demuxer.Instance()->data_end));
        if (m_demuxer.Video() != nullptr)
            DrawPosition(values, m_timeline.video, "video");
        if (m_demuxer.Audio() != nullptr)
            DrawPosition(values, m_timeline.audio, m_both ? "audio dots" : "audio");
        DrawLegend(top - 12, StreamLegend(m_both ? "audio dots" : "audio"));
    }

    void DrawPosition(const Axis& values, const StreamTimeline& stream, const char* kind)
    {
        std::string points;
        for (size_t column = 0; column < COLUMNS; ++column) {
            const Range& range = stream.positions[column];
            if (range.IsEmpty())
                continue;
            points += fmt::format("{}{:.1f} {:.1f}", points.empty() ? 'M' : 'L', ColumnX(column), values.At(range.low));
            points += fmt::format("V{:.1f}", values.At(range.high));
        }
        m_svg.Add("<path class=\"{}\" d=\"{}\"/>", kind, points.empty() ? "M0 0" : points);
    }

    void DrawLead(double top)
    {
        Range all{0, 0};
        std::string upper;
        std::string lower;
        for (const Range& range : m_timeline.lead) {
            if (!range.IsEmpty()) {
                all.Take(range.low);
                all.Take(range.high);
            }
        }
        const Axis values = DrawFrame(top, SMALL, "Interleaving: audio ahead of video", LEAD_UNITS, all.low, all.high);
        for (size_t column = 0; column < COLUMNS; ++column) {
            const Range& range = m_timeline.lead[column];
            if (range.IsEmpty())
                continue;
            upper += fmt::format("{}{:.1f} {:.1f}", upper.empty() ? 'M' : 'L', ColumnX(column), values.At(range.high));
            lower.insert(0, fmt::format("L{:.1f} {:.1f}", ColumnX(column), values.At(range.low)));
        }
        m_svg.Line(LEFT, values.At(0), RIGHT, values.At(0), "axis");
        if (!upper.empty())
            m_svg.Add("<path class=\"lead\" d=\"{}{}Z\"/>", upper, lower);
    }

    const Demuxer& m_demuxer;
    const Timeline& m_timeline;
    const bool m_both;
    const Axis m_time;
    Svg m_svg;
};

} // namespace

int RunPlot(const PlotOptions& options)
{
    try {
        Demuxer demuxer(options.file, 0);
        WarnIfCutShort(demuxer);
        const Timeline timeline = ReadTimeline(demuxer, COLUMNS);
        const std::string drawing = Plot(demuxer, timeline).Draw();
        OutputFile file(options.out, options.file);
        file.Begin();
        file.Write(drawing);
        file.Close();
        return DONE;
    } catch (const DemuxError& error) {
        Complain(options.file, error.Message());
        return FAILED;
    }
}

} // namespace tool
