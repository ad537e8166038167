// Frames in the order of their times, from one reader or from two, and how they are printed.
#ifndef FLVDMX_TOOLS_FRAME_SOURCE_H
#define FLVDMX_TOOLS_FRAME_SOURCE_H

#include <cstdint>
#include <optional>
#include <string>

#include "tools/input.h"
#include "tools/played.h"
#include "tools/report.h"

namespace tool {

/** What is reported about a frame. */
struct FrameRecord {
    flvdmx::Stream stream;
    bool keyframe;
    int64_t timeMs;   /**< from the first timestamp; negative if the tag's is lower */
    int64_t shownMs;  /**< presentation time */
    size_t size;      /**< bytes */
    int64_t position; /**< of the tag in the file */
    uint32_t crc;     /**< CRC-32 of the frame */

    explicit FrameRecord(const flvdmx::Frame& frame);

    bool IsVideo() const { return stream == flvdmx::Stream::video; }
    std::string Line(uint64_t number) const; /**< under HEADING */
    std::string Csv(uint64_t number) const;  /**< under CSV_HEADING */
    Json Object(uint64_t number) const;

    static const char* const HEADING;
    static const char* const CSV_HEADING;
};

/** Delivers the frames of an input. If it has a separate audio reader, merges the two streams by time. */
class FrameSource {
public:
    using Frame = std::optional<FrameRecord>;

    /** @param input borrowed
     *  @param streams FLVD_STREAM_* bits of the frames wanted
     *  @param played borrowed, receives the frames of a single reader; may be null */
    FrameSource(Input& input, uint32_t streams, Played* played = nullptr);

    /** @return the next frame; nothing at the end of the data, which a growing file may extend later. Throws
     *          FileError */
    Frame Next();

    /** Call it after the file has grown: streams that were at their end are read again. */
    void Refresh();

private:
    // With two readers, each stream is read one frame ahead, to know which frame is next. A stream at its end does not
    // delay the other one.
    struct Lane {
        flvdmx::Stream stream;
        bool wanted;
        bool ended = false;
        Frame frame{};
    };

    Frame NextOfOne();
    void Fill(Lane& lane);

    Input& m_input;
    const uint32_t m_streams;
    Played* const m_played;
    Lane m_video;
    Lane m_audio;
};

/** @return the next frame in the file, valid until the next call; nothing at the end. Throws FileError */
std::optional<flvdmx::Frame> NextFrame(Input& input, flvdmx::Stream stream = flvdmx::Stream::any);

} // namespace tool

#endif
