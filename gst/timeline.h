/*
 * Decoding times that stay continuous where timestamps restart, as in recordings that were joined or whose timestamps
 * exceeded 32 bits.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <array>
#include <optional>

namespace flvdmx_gst {

class Timeline {
public:
    /** Call it after a seek to `time`, as in the file. */
    void jump(flvdmx::Milliseconds time);
    /** Places the first frame at 0, whatever its timestamp is. */
    void start_at_first_frame();

    /** Returns the time of the next frame, 0 or more. */
    flvdmx::Milliseconds follow(const flvdmx::Frame& frame);
    /** Returns what is added to the times of the file since the last restart. */
    flvdmx::Milliseconds offset() const { return m_offset; }

private:
    struct Stream {
        std::optional<flvdmx::Milliseconds> last;
        flvdmx::Milliseconds distance{}; // between its last two frames
        flvdmx::Milliseconds offset{};   // m_offset, except for frames from before a restart of the other stream
    };

    flvdmx::Milliseconds m_offset{};
    flvdmx::Milliseconds m_latest{}; // the later time of both streams
    std::array<Stream, 2> m_streams; // video, audio
    bool m_starts_at_first_frame = false;
};

} // namespace flvdmx_gst
