// What happens over the time of a file.
#include "tools/timeline.h"

#include <algorithm>
#include <cmath>
#include <optional>
#include <utility>

#include "tools/played.h"
#include "tools/progress.h"
#include "tools/svg.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

namespace {

constexpr double MS_PER_SECOND = 1000;
constexpr double LEAST_DURATION = 0.1;
constexpr double LEAST_INTERVAL = 0.1; // a few frames
constexpr int MOST_INTERVALS = 200;

// A frame as it was read.
struct Point {
    double time;
    double position;
    uint32_t size;
    bool video;
    bool keyframe;
    bool loss; // bytes were skipped before it
    bool jump; // the timestamps jump to it
};

std::vector<Point> ReadPoints(const Input& input, Timeline& timeline)
{
    std::vector<Point> points;
    Times times;
    ReadProgress progress(input.name, input.info.size);
    Played played(input);
    int64_t skipped = 0;
    played.Walk([&](const Tag& tag) {
        if (!tag.has_frame())
            return true;
        const uint64_t jumps = times.Jumps();
        times.Take(tag.stream(), input.TimeOf(tag));
        const bool loss = played.BytesSkipped() > std::exchange(skipped, played.BytesSkipped());
        points.push_back({static_cast<double>(times.Time()) / MS_PER_SECOND, static_cast<double>(tag.position),
                          tag.frame_size(), tag.is_video(), IsVideoKeyframe(tag), loss, times.Jumps() > jumps});
        return true;
    });
    progress.Wipe();
    played.Warn();
    timeline.durationMs = times.Latest();
    timeline.bytesSkipped = played.BytesSkipped();
    return points;
}

void Divide(Timeline& timeline, size_t columns)
{
    timeline.duration = std::max(static_cast<double>(timeline.durationMs) / MS_PER_SECOND, LEAST_DURATION);
    timeline.interval = std::max(TimeStep(timeline.duration, MOST_INTERVALS), LEAST_INTERVAL);
    timeline.lead.resize(columns);
    for (StreamTimeline* const stream : {&timeline.video, &timeline.audio}) {
        stream->bits.resize(static_cast<size_t>(std::max(std::round(timeline.duration / timeline.interval), 1.0)));
        stream->positions.resize(columns);
    }
}

// Times before the first timestamp belong to the first cell.
size_t CellOf(double time, double cellSize, size_t cells)
{
    return static_cast<size_t>(std::clamp(std::floor(time / cellSize), 0.0, static_cast<double>(cells - 1)));
}

// The longest step, in seconds, that is not drawn as a pause of the stream.
double LongestStep(const Timeline& timeline, const StreamTimeline& stream)
{
    constexpr double LEAST = 1;
    constexpr double TIMES_THE_AVERAGE = 10;
    return std::max(LEAST,
                    TIMES_THE_AVERAGE * timeline.duration / static_cast<double>(std::max<uint64_t>(stream.frames, 1)));
}

// Adds frames to a timeline, in file order.
class Gatherer {
public:
    explicit Gatherer(Timeline& timeline) : m_timeline(timeline) {}

    void Take(const Point& point)
    {
        Lane& lane = point.video ? m_video : m_audio;
        StreamTimeline& stream = point.video ? m_timeline.video : m_timeline.audio;
        AddMarks(point, lane, stream);
        const size_t columns = m_timeline.lead.size();
        const size_t column = CellOf(point.time, m_timeline.duration / static_cast<double>(columns), columns);
        stream.bits[CellOf(point.time, m_timeline.interval, stream.bits.size())] += point.size * 8.0;
        Enter(stream.positions[column], lane.breaks, point.position);
        if (point.keyframe)
            m_timeline.keyframes.push_back(point.time);
        lane.last = lane.sinceBreak = point.time;
        if (m_video.sinceBreak && m_audio.sinceBreak)
            TakeLead(m_timeline.lead[column], *m_audio.sinceBreak - *m_video.sinceBreak);
    }

private:
    struct Lane {
        std::optional<double> last{};
        std::optional<double> sinceBreak{}; // the last time, unless a break came after it
        bool breaks = false;                // the curve does not continue
    };

    static void Enter(Range& range, bool& breaks, double value)
    {
        range.breaks = range.breaks || (range.IsEmpty() && breaks);
        breaks = breaks && !range.breaks;
        range.Take(value);
    }

    void AddMarks(const Point& point, Lane& lane, const StreamTimeline& stream)
    {
        const double latest = std::max(m_video.last.value_or(0), m_audio.last.value_or(0));
        const bool gap = lane.last && point.time - *lane.last > LongestStep(m_timeline, stream);
        if (point.jump)
            m_timeline.marks.push_back({Mark::Kind::jump, point.time, point.time});
        if (point.loss)
            m_timeline.marks.push_back({Mark::Kind::damage, std::min(latest, point.time), point.time});
        else if (gap)
            m_timeline.marks.push_back({Mark::Kind::gap, *lane.last, point.time});
        if (!point.jump && !point.loss && !gap)
            return;
        lane.breaks = m_leadBreaks = true;
        if (!gap)
            m_video.breaks = m_audio.breaks = true;
        m_video.sinceBreak = m_audio.sinceBreak = std::nullopt;
    }

    void TakeLead(Range& range, double lead)
    {
        if (!m_leadBreaks)
            range.Take(m_lead); // the lead before this frame
        Enter(range, m_leadBreaks, lead);
        m_lead = lead;
    }

    Timeline& m_timeline;
    Lane m_video;
    Lane m_audio;
    double m_lead = 0;
    bool m_leadBreaks = true;
};

// Merges marks that would touch in the drawing. A jump remains a moment.
void MergeMarks(std::vector<Mark>& marks, double distance)
{
    const auto order = [](const Mark& mark) { return std::make_pair(mark.kind, mark.from); };
    std::sort(marks.begin(), marks.end(), [&](const Mark& a, const Mark& b) { return order(a) < order(b); });
    std::vector<Mark> merged;
    for (const Mark& mark : marks) {
        if (merged.empty() || merged.back().kind != mark.kind || mark.from > merged.back().to + distance)
            merged.push_back(mark);
        else if (mark.kind != Mark::Kind::jump)
            merged.back().to = std::max(merged.back().to, mark.to);
    }
    marks = std::move(merged);
}

} // namespace

void Range::Take(double value)
{
    low = std::min(low, value);
    high = std::max(high, value);
}

bool Timeline::IsMissing(double from, double to) const
{
    return std::any_of(marks.begin(), marks.end(),
                       [=](const Mark& mark) { return mark.from <= from && mark.to >= to; });
}

Timeline ReadTimeline(const Input& input, size_t columns)
{
    Timeline timeline{};
    const std::vector<Point> points = ReadPoints(input, timeline);
    for (const Point& point : points) {
        StreamTimeline& stream = point.video ? timeline.video : timeline.audio;
        ++stream.frames;
        stream.bytes += point.size;
    }
    Divide(timeline, columns);
    Gatherer gatherer(timeline);
    for (const Point& point : points)
        gatherer.Take(point);
    MergeMarks(timeline.marks, timeline.duration / static_cast<double>(columns));
    return timeline;
}

} // namespace tool
