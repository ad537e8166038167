// Which jumps of timestamps are real, and times that continue across them.
#ifndef FLVDMX_TOOLS_TIMES_H
#define FLVDMX_TOOLS_TIMES_H

#include <array>
#include <cstdint>
#include <optional>

#include "flvdmx/flvdmx.hpp"

namespace tool {

/**
 * Places frames in time, in file order. A stream jumps when its time goes back by more than a second, or forward by
 * more than a limit while the other stream does not lead there as well: a recording that started again, or a gap. The
 * time then continues after the latest one so far. Whether a jump is real shows with the next frame; a frame that is
 * alone with its time is placed after the one before it. A smaller step back is jitter: the time stands still.
 * Streams of a frame every few minutes do not jump; a file of one stream that starts with a long step has such a
 * stream. Timestamps of 32 bits may wrap around.
 */
class Times {
public:
    static constexpr int64_t USUAL_LIMIT_MS = 10000;

    /** How the timestamp of a frame follows the ones before it in its stream. */
    enum class Step {
        on,    /**< as it should, or first of its stream */
        back,  /**< a little too early */
        pause, /**< beyond the limit, but the other stream has been there, or all frames are as far apart */
        odd,   /**< jumps, or is alone with its time: the next frame tells */
        alone, /**< it continues from the frame before the last one, which alone had a wrong time */
        jump   /**< the stream has jumped, with this frame or with the odd one before it */
    };

    /** @param limitMs largest step forward that is no jump */
    explicit Times(int64_t limitMs = USUAL_LIMIT_MS) : m_limit(limitMs) {}

    /** Takes the timestamp, in ms from anywhere, of the next frame in the file. */
    Step Take(flvdmx::Stream stream, int64_t timestamp);

    /** @return the time of something at this timestamp after the last frame: not further from it than the limit */
    int64_t Near(int64_t timestamp) const;

    int64_t Time() const { return m_time; }     /**< of the last frame, in ms */
    int64_t Latest() const { return m_latest; } /**< the latest of all frames so far */
    uint64_t Jumps() const { return m_jumps; }  /**< of the recording: both streams together make one */

private:
    // Shifts are added to timestamps to make times.
    struct Lane {
        bool started = false;
        int64_t time = 0;               // of the last frame
        int64_t placed = 0;             // of the last frame that was not odd; less than `time` while that stands still
        int64_t before = 0;             // the same of the one before it
        int64_t limit = 0;              // largest step forward
        int64_t step = 0;               // usual one
        int64_t shift = 0;              // of the last frame that was not odd
        std::optional<int64_t> tried{}; // the one that the last frame needs, which was odd
        int64_t oddStep = 0;            // to the last frame, when it was odd
    };

    bool Fits(const Lane& lane, int64_t timestamp, int64_t shift) const;
    Step Judge(Lane& lane, int64_t timestamp);
    bool Join(Lane& lane, int64_t timestamp);
    bool IsSlow(Lane& lane, int64_t step) const;

    const int64_t m_limit;
    std::array<Lane, 2> m_lanes; // video, audio
    int64_t m_shift = 0;         // since the last jump
    int64_t m_time = 0;
    int64_t m_latest = 0;
    uint64_t m_jumps = 0;
};

} // namespace tool

#endif
