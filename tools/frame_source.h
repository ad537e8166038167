// Frames in the order of their times, from one reader or from two.
#ifndef FLVDMX_TOOLS_FRAME_SOURCE_H
#define FLVDMX_TOOLS_FRAME_SOURCE_H

#include <cstdint>
#include <optional>

#include "tools/demuxer.h"

namespace tool {

/** Delivers the frames of a demuxer; with a separate audio reader it merges the two streams by time. */
class FrameSource {
public:
    /** @param demuxer borrowed
     *  @param streams FLVD_STREAM_* bits of the frames wanted */
    FrameSource(Demuxer& demuxer, uint32_t streams);

    /** @return the next frame; nothing at the end of the data */
    std::optional<Frame> Next();

    /** The file has grown: streams that were at their end are asked again. */
    void Refresh();

private:
    // With two readers each stream is asked one frame ahead, to know which one is next. A stream at its end does
    // not hold up the other one.
    struct Lane {
        uint32_t stream;
        bool asked;
        bool ended = false;
        std::optional<Frame> frame{};
        int64_t end = 0; // byte position behind the frame: the order in the file settles equal times
    };

    std::optional<Frame> NextOfOne();
    void Fill(Lane& lane);
    static bool IsBefore(const Lane& a, const Lane& b);

    Demuxer& m_demuxer;
    const uint32_t m_streams;
    Lane m_video;
    Lane m_audio;
};

} // namespace tool

#endif
