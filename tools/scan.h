// What is known only after reading all frames of a file.
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
    int64_t longestDistanceMs = 0;                      /**< from one keyframe to the next */
    double averageDistanceMs = 0;                       /**< both are 0 for fewer than two keyframes */
    flvdmx::Milliseconds played{};                      /**< duration in times made continuous across jumps */
    uint64_t jumps = 0;                                 /**< of the timestamps */
    int64_t bytesSkipped = 0;
};

/** Plays the whole file. */
FileScan ScanFile(const std::string& name);

/** @return true if a few sampled tags have times that only a restart explains; takes a few reads */
bool SeemsToRestart(const Input& input);

/** Warns on standard error if one time may occur at several positions in the file. */
void WarnOfRestarts(const Input& input);

} // namespace tool

#endif
