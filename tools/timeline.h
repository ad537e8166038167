// What happens over the time of a file, collected for the drawing.
#ifndef FLVDMX_TOOLS_TIMELINE_H
#define FLVDMX_TOOLS_TIMELINE_H

#include <cstdint>
#include <limits>
#include <vector>

#include "tools/input.h"

namespace tool {

/** The range of the values taken, empty at first. */
struct Range {
    double low = std::numeric_limits<double>::infinity();
    double high = -std::numeric_limits<double>::infinity();
    bool breaks = false; /**< it does not continue the range before it */

    bool IsEmpty() const { return low > high; }
    void Take(double value);
};

struct StreamTimeline {
    std::vector<double> bits;     /**< of each interval */
    std::vector<Range> positions; /**< in the file, of each column */
    int64_t bytes = 0;            /**< of all frames */
    uint64_t frames = 0;
};

/** A range of time in which something is missing, or the moment of a jump. */
struct Mark {
    enum class Kind { gap, damage, jump } kind;
    double from;
    double to;
};

/** Times are in seconds from the first timestamp, continuous across jumps. The duration is divided into intervals, the
 *  last of which includes the rest, and into columns. */
struct Timeline {
    int64_t durationMs;
    double duration; /**< seconds, never 0 */
    double interval; /**< seconds */
    StreamTimeline video;
    StreamTimeline audio;
    std::vector<double> keyframes; /**< their times */
    std::vector<Range> lead;       /**< of each column: by how much audio is ahead of video in the file, seconds */
    std::vector<Mark> marks;
    int64_t bytesSkipped;

    /** @return true if nothing is known about this time */
    bool IsMissing(double from, double to) const;
};

/** Reads the whole file, and warns on standard error about what is skipped. Needs a few bytes of memory per frame. */
Timeline ReadTimeline(const Input& input, size_t columns);

} // namespace tool

#endif
