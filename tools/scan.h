// What only a look at all frames of a file tells.
#ifndef FLVDMX_TOOLS_SCAN_H
#define FLVDMX_TOOLS_SCAN_H

#include <cstdint>
#include <optional>
#include <string>

#include "tools/input.h"

namespace tool {

struct FileScan {
    uint64_t videoFrames = 0;
    uint64_t audioFrames = 0;
    uint64_t keyframes = 0;                             /**< of video */
    std::optional<flvdmx::Milliseconds> lastKeyframe{}; /**< from the first timestamp */
    flvdmx::Milliseconds longestDistance{};             /**< of one keyframe to the next */
    flvdmx::Milliseconds allDistances{};                /**< their sum */
    flvdmx::Milliseconds played{};                      /**< duration, times going on where they start again */
    uint64_t restarts = 0;                              /**< of the timestamps */
    int64_t bytesLeftOut = 0;

    /** @return average distance of the keyframes, 0 for fewer than two */
    double AverageDistanceMs() const;
};

/** Plays the whole file. */
FileScan ScanFile(const std::string& name);

/** @return true when tags here and there in the file have times that only a restart explains; a few reads */
bool SeemsToRestart(const Input& input);

} // namespace tool

#endif
