// What is known only after reading all frames of a file.
#include "tools/scan.h"

#include <algorithm>

#include "tools/frame_source.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

FileScan ScanFile(const std::string& name)
{
    flvdmx::Options options;
    options.restarting_timestamps = true;
    Input input(name, options);
    FileScan scan;
    Times times;
    Losses losses(input);
    const ReadProgress progress(name, input.info.size);
    int64_t first = 0; // keyframes
    int64_t last = 0;
    while (const std::optional<flvdmx::Frame> frame = NextFrame(input, flvdmx::Stream::any)) {
        losses.Take(*frame);
        times.Take(frame->stream, frame->time.count());
        const bool video = frame->stream == flvdmx::Stream::video;
        ++(video ? scan.videoFrames : scan.audioFrames);
        if (!video || !frame->keyframe)
            continue;
        if (scan.keyframes++ == 0)
            first = last = times.Time();
        scan.longestDistanceMs = std::max(scan.longestDistanceMs, times.Time() - last);
        scan.lastKeyframe = frame->time;
        last = times.Time();
    }
    losses.Finish();
    if (scan.keyframes > 1)
        scan.averageDistanceMs = static_cast<double>(last - first) / static_cast<double>(scan.keyframes - 1);
    scan.bytesSkipped = losses.Bytes();
    scan.played = flvdmx::Milliseconds(times.Latest());
    scan.jumps = times.Jumps();
    return scan;
}

// Without a restart, the times of each stream rise through the file and do not exceed the last one.
bool SeemsToRestart(const Input& input)
{
    constexpr int64_t SAMPLES = 16;
    constexpr int64_t NEAR = 1 << 20; // bytes; inside a larger tag, no sample is found
    constexpr uint32_t JITTER_MS = 2000;
    flvdmx::Options options;
    options.restarting_timestamps = true;
    const Input any(input.name, options);
    TagReader reader(any);
    uint32_t video = 0; // the latest times
    uint32_t audio = 0;
    for (int64_t i = 1; i < SAMPLES; ++i) {
        const int64_t position = input.info.size / SAMPLES * i;
        const std::optional<Tag> tag = reader.Find(position, position + NEAR);
        if (!tag || tag->IsScript())
            continue;
        uint32_t& latest = tag->IsVideo() ? video : audio;
        if (tag->timestamp + JITTER_MS < latest || tag->timestamp > input.Instance().last_ts + JITTER_MS)
            return true;
        latest = std::max(latest, tag->timestamp);
    }
    return false;
}

void WarnOfRestarts(const Input& input)
{
    if (SeemsToRestart(input))
        Complain(input.name, "warning: the timestamps jump, so a seek may land in the wrong part of the file: 'flvdmx "
                             "repair' makes them continuous");
}

} // namespace tool
