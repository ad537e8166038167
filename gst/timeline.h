/*
 * Decoding times that go on where timestamps start again midway, as in recordings that were joined or whose 32 bits
 * were exceeded.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <array>
#include <optional>

namespace flvdmx_gst {

class Timeline {
public:
    /** What comes next was read after a jump to `time`: times of the file. */
    void jump(flvdmx::Milliseconds time);
    /** The first frame is at 0, whatever its timestamp says. */
    void start_at_first_frame();

    /** The time of the next frame, 0 or more. */
    flvdmx::Milliseconds follow(const flvdmx::Frame& frame);
    /** What is added to the times of the file, since they started again. */
    flvdmx::Milliseconds offset() const { return m_offset; }

private:
    struct Stream {
        std::optional<flvdmx::Milliseconds> last;
        flvdmx::Milliseconds distance{}; // between its last two frames
    };

    flvdmx::Milliseconds m_offset{};
    flvdmx::Milliseconds m_latest{}; // of both streams
    std::array<Stream, 2> m_streams; // video, audio
    bool m_starts_at_first_frame = false;
};

} // namespace flvdmx_gst
