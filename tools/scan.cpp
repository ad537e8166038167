// What only a look at all frames of a file tells.
#include "tools/scan.h"

#include <algorithm>

#include "tools/frame_source.h"
#include "tools/progress.h"
#include "tools/tags.h"

namespace tool {

double FileScan::AverageDistanceMs() const
{
    return keyframes < 2 ? 0 : static_cast<double>(allDistances.count()) / static_cast<double>(keyframes - 1);
}

FileScan ScanFile(const std::string& name)
{
    flvdmx::Options options;
    options.restarting_timestamps = true;
    Input input(name, options);
    FileScan scan;
    Takes takes;
    Losses losses(input);
    ProgressBar progress(name, input.info.size);
    flvdmx::Milliseconds keyframe{}; // the last one
    while (const std::optional<flvdmx::Frame> frame = NextFrame(input, flvdmx::Stream::any)) {
        progress.ShowDone(frame->position);
        losses.Take(*frame);
        const bool video = frame->stream == flvdmx::Stream::video;
        const flvdmx::Milliseconds time = takes.Continue(*frame);
        ++(video ? scan.videoFrames : scan.audioFrames);
        if (!video || !frame->keyframe)
            continue;
        if (scan.keyframes++ > 0) {
            scan.longestDistance = std::max(scan.longestDistance, time - keyframe);
            scan.allDistances += time - keyframe;
        }
        scan.lastKeyframe = frame->time;
        keyframe = time;
    }
    losses.Finish();
    scan.bytesLeftOut = losses.Bytes();
    scan.played = takes.Played();
    scan.restarts = takes.Restarts();
    return scan;
}

// The times of a recording that did not restart rise along the file, up to the last one.
bool SeemsToRestart(const Input& input)
{
    constexpr int64_t PLACES = 16;
    constexpr int64_t NEAR = 1 << 20; // bytes: a place inside a larger tag tells nothing
    constexpr uint32_t JITTER_MS = 2000;
    flvdmx::Options options;
    options.restarting_timestamps = true;
    const Input any(input.name, options);
    TagReader reader(any);
    uint32_t latest = 0;
    for (int64_t i = 1; i < PLACES; ++i) {
        const int64_t place = input.info.size / PLACES * i;
        const std::optional<Tag> tag = reader.Find(place, place + NEAR);
        if (!tag || tag->IsScript())
            continue;
        if (tag->timestamp + JITTER_MS < latest || tag->timestamp > input.Instance().last_ts + JITTER_MS)
            return true;
        latest = std::max(latest, tag->timestamp);
    }
    return false;
}

} // namespace tool
