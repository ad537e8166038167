// What happens over the time of a file, gathered for drawing.
#ifndef FLVDMX_TOOLS_TIMELINE_H
#define FLVDMX_TOOLS_TIMELINE_H

#include <cstdint>
#include <limits>
#include <vector>

#include "tools/input.h"

namespace tool {

/** The range of the values met, nothing at first. */
struct Range {
    double low = std::numeric_limits<double>::infinity();
    double high = -std::numeric_limits<double>::infinity();
    bool breaks = false; /**< it does not go on from the range before */

    bool IsEmpty() const { return low > high; }
    void Take(double value);
};

struct StreamTimeline {
    std::vector<double> bits;     /**< of each interval */
    std::vector<Range> positions; /**< in the file, of each column */
    int64_t bytes = 0;            /**< of all frames */
    uint64_t frames = 0;
};

/** A stretch of time in which something is missing, or a moment. */
struct Mark {
    enum class Kind { gap, damage, jump } kind;
    double from;
    double to;
};

/** Times in seconds from the first timestamp, continuing after jumps; intervals, the last one with the
 *  rest, and columns divide the duration. */
struct Timeline {
    int64_t durationMs;
    double duration; /**< seconds, never 0 */
    double interval; /**< seconds */
    StreamTimeline video;
    StreamTimeline audio;
    std::vector<double> keyframes; /**< their times */
    std::vector<Range> lead;       /**< of each column: by how much audio is ahead of video in the file, seconds */
    std::vector<Mark> marks;
    int64_t bytesLeftOut;

    /** @return true when nothing is known of this time */
    bool IsMissing(double from, double to) const;
};

/** Reads the whole file, and warns on standard error what is skipped. Takes a few bytes of memory per frame. */
Timeline ReadTimeline(Input& input, size_t columns);

} // namespace tool

#endif
