// Tells real jumps of timestamps from single wrong ones, and makes times continuous across them.
#ifndef FLVDMX_TOOLS_TIMES_H
#define FLVDMX_TOOLS_TIMES_H

#include <array>
#include <cstdint>
#include <optional>

#include "flvdmx/flvdmx.hpp"

namespace tool {

/**
 * Assigns times to frames, in file order. A stream jumps if its timestamps go back by more than a second, or forward by
 * more than a limit to where the other stream has not been: the recording restarted, or a part is missing. The time
 * then continues from the latest one so far. Only the next frame shows whether a jump is real; a single frame with a
 * wrong timestamp gets a time after the previous frame's. A smaller step back is jitter: the previous time is repeated.
 * Streams with a frame every few minutes do not jump; a file with one stream that starts with a long step has such a
 * stream. Timestamps of 32 bits may wrap around.
 */
class Times {
public:
    static constexpr int64_t USUAL_LIMIT_MS = 10000;

    /** How the timestamp of a frame follows the previous ones of its stream. */
    enum class Step {
        on,    /**< as expected, or it is the first of its stream */
        back,  /**< goes back, but by less than a jump */
        pause, /**< beyond the limit, but the other stream has been there, or all frames are that far apart */
        odd,   /**< a jump, or a single wrong timestamp: the next frame shows which */
        alone, /**< continues from the frame before the previous one, which had a single wrong timestamp */
        jump   /**< the stream has jumped, at this frame or at the odd one before it */
    };

    /** @param limitMs largest step forward that is not a jump */
    explicit Times(int64_t limitMs = USUAL_LIMIT_MS) : m_limit(limitMs) {}

    /** Takes the timestamp, in ms from anywhere, of the next frame in the file. */
    Step Take(flvdmx::Stream stream, int64_t timestamp);

    /** @return the time for a timestamp found after the last frame; the last frame's if they differ by more than the
     *          limit */
    int64_t Near(int64_t timestamp) const;

    int64_t Time() const { return m_time; }     /**< of the last frame, in ms */
    int64_t Latest() const { return m_latest; } /**< the latest of all frames so far */
    uint64_t Jumps() const { return m_jumps; }  /**< of the recording: both streams together make one */

private:
    // Shifts are added to timestamps to make times.
    struct Lane {
        bool started = false;
        int64_t time = 0;               // of the last frame
        int64_t placed = 0;             // of the last frame that was not odd; less than `time` after jitter
        int64_t before = 0;             // the same for the one before it
        int64_t limit = 0;              // largest step forward
        int64_t step = 0;               // usual step
        int64_t shift = 0;              // of the last frame that was not odd
        std::optional<int64_t> tried{}; // the shift that the last frame needs, if it was odd
        int64_t oddStep = 0;            // step to the last frame, if it was odd
    };

    bool Fits(const Lane& lane, int64_t timestamp, int64_t shift) const;
    Step Classify(Lane& lane, int64_t timestamp);
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
