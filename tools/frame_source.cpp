// Frames in the order of their times.
#include "tools/frame_source.h"

#include <utility>

namespace tool {

FrameSource::FrameSource(Demuxer& demuxer, uint32_t streams)
    : m_demuxer(demuxer),
      m_streams(streams), m_video{FLVD_STREAM_VIDEO, (streams & FLVD_STREAM_VIDEO) != 0 && demuxer.Video() != nullptr},
      m_audio{FLVD_STREAM_AUDIO, (streams & FLVD_STREAM_AUDIO) != 0 && demuxer.Audio() != nullptr}
{
}

void FrameSource::Refresh()
{
    m_video.ended = false;
    m_audio.ended = false;
}

void FrameSource::Fill(Lane& lane)
{
    if (!lane.asked || lane.ended || lane.frame)
        return;
    lane.frame = m_demuxer.NextFrame(lane.stream);
    lane.ended = !lane.frame;
    lane.end = lane.ended ? 0 : m_demuxer.Position(lane.stream);
}

bool FrameSource::IsBefore(const Lane& a, const Lane& b)
{
    if (!a.frame || !b.frame)
        return a.frame.has_value();
    return std::pair(a.frame->timeMs, a.end) < std::pair(b.frame->timeMs, b.end);
}

std::optional<Frame> FrameSource::NextOfOne()
{
    for (;;) {
        const std::optional<Frame> frame = m_demuxer.NextFrame(0);
        if (!frame || (frame->stream & m_streams) != 0)
            return frame;
    }
}

std::optional<Frame> FrameSource::Next()
{
    if (!m_demuxer.HasSeparateAudio())
        return NextOfOne();
    Fill(m_video);
    Fill(m_audio);
    Lane& next = IsBefore(m_video, m_audio) ? m_video : m_audio;
    return std::exchange(next.frame, std::nullopt);
}

} // namespace tool
