// What happens over the time of a file, gathered for drawing.
#ifndef FLVDMX_TOOLS_TIMELINE_H
#define FLVDMX_TOOLS_TIMELINE_H

#include <cstdint>
#include <limits>
#include <optional>
#include <vector>

#include "tools/demuxer.h"

namespace tool {

/** The range of the values met, nothing at first. */
struct Range {
    double low = std::numeric_limits<double>::infinity();
    double high = -std::numeric_limits<double>::infinity();

    bool IsEmpty() const { return low > high; }
    void Take(double value);
};

struct StreamTimeline {
    std::vector<double> bits;     /**< of each interval */
    std::vector<Range> positions; /**< in the file, of each column */
    int64_t bytes = 0;            /**< of all frames */
    uint64_t frames = 0;
};

/** Times in seconds from the first timestamp; intervals, the last one with the rest, and columns divide the duration.
 */
struct Timeline {
    int64_t durationMs;
    double duration; /**< seconds, never 0 */
    double interval; /**< seconds */
    size_t columns;
    StreamTimeline video;
    StreamTimeline audio;
    std::vector<double> keyframes; /**< their times */
    std::vector<Range> lead;       /**< of each column: by how much audio is ahead of video in the file, seconds */
};

/** Reads the whole file, and tells on standard error what it passed over. The memory taken depends on the duration only
 * by the keyframes. */
Timeline ReadTimeline(Demuxer& demuxer, size_t columns);

} // namespace tool

#endif
