// What happens over the time of a file.
#include "tools/timeline.h"

#include <algorithm>
#include <cmath>

#include "tools/progress.h"
#include "tools/report.h"
#include "tools/svg.h"
#include "tools/tags.h"

namespace tool {

namespace {

constexpr double MILLISECONDS_A_SECOND = 1000;
constexpr double LEAST_DURATION = 0.1;
constexpr double LEAST_INTERVAL = 0.1; // a few frames
constexpr int MOST_INTERVALS = 200;

Timeline Prepare(int64_t durationMs, size_t columns)
{
    Timeline timeline{};
    timeline.durationMs = durationMs;
    timeline.duration = std::max(static_cast<double>(durationMs) / MILLISECONDS_A_SECOND, LEAST_DURATION);
    timeline.interval = std::max(TimeStep(timeline.duration, MOST_INTERVALS), LEAST_INTERVAL);
    timeline.columns = columns;
    timeline.lead.resize(columns);
    for (StreamTimeline* const stream : {&timeline.video, &timeline.audio}) {
        stream->bits.resize(static_cast<size_t>(std::max(std::round(timeline.duration / timeline.interval), 1.0)));
        stream->positions.resize(columns);
    }
    return timeline;
}

// Times before the first and behind the last timestamp count to the ends.
size_t CellOf(double time, double cellSize, size_t cells)
{
    return static_cast<size_t>(std::clamp(std::floor(time / cellSize), 0.0, static_cast<double>(cells - 1)));
}

int64_t TimeOf(const Demuxer& demuxer, const Tag& tag)
{
    return int64_t{tag.timestamp} - demuxer.Instance()->first_ts;
}

int64_t LatestTime(const Demuxer& demuxer)
{
    int64_t latest = demuxer.Instance()->duration_ms;
    TagReader reader(demuxer);
    while (const std::optional<Tag> tag = reader.Next())
        latest = std::max(latest, TimeOf(demuxer, *tag));
    return latest;
}

Timeline Gather(const Demuxer& demuxer, TagReader& reader, int64_t durationMs, size_t columns)
{
    Timeline timeline = Prepare(durationMs, columns);
    std::optional<double> videoTime;
    std::optional<double> audioTime;
    double lead = 0;
    ProgressBar progress(demuxer.Path(), demuxer.Instance()->data_end);
    while (const std::optional<Tag> tag = reader.Next()) {
        progress.ShowDone(tag->position);
        if (!tag->IsFrame())
            continue;
        const double time = static_cast<double>(TimeOf(demuxer, *tag)) / MILLISECONDS_A_SECOND;
        StreamTimeline& stream = tag->IsVideo() ? timeline.video : timeline.audio;
        const size_t column = CellOf(time, timeline.duration / static_cast<double>(columns), columns);
        stream.bits[CellOf(time, timeline.interval, stream.bits.size())] += tag->size * 8.0;
        stream.positions[column].Take(static_cast<double>(tag->position));
        stream.bytes += tag->size;
        ++stream.frames;
        (tag->IsVideo() ? videoTime : audioTime) = time;
        if (tag->IsKeyframe())
            timeline.keyframes.push_back(time);
        if (videoTime && audioTime) {
            timeline.lead[column].Take(lead); // as it was until here
            timeline.lead[column].Take(lead = *audioTime - *videoTime);
        }
    }
    return timeline;
}

} // namespace

void Range::Take(double value)
{
    low = std::min(low, value);
    high = std::max(high, value);
}

// A file whose times all lie below those at its end is read once. Else the axis needs the latest time first.
Timeline ReadTimeline(Demuxer& demuxer, size_t columns)
{
    TagReader reader(demuxer);
    Timeline timeline = Gather(demuxer, reader, demuxer.Instance()->duration_ms, columns);
    if (reader.Skipped() == 0)
        return timeline;
    demuxer.AcceptAllTimes();
    TagReader again(demuxer);
    timeline = Gather(demuxer, again, LatestTime(demuxer), columns);
    WarnOfSkipped(demuxer, again);
    return timeline;
}

} // namespace tool
