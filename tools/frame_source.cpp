// Frames in the order of their times.
#include "tools/frame_source.h"

#include <tuple>
#include <utility>

#include <boost/crc.hpp>
#include <fmt/core.h>

#include "tools/report.h"

namespace tool {

namespace {

uint32_t Crc32(flvdmx::Bytes bytes)
{
    boost::crc_32_type crc;
    crc.process_bytes(bytes.data(), bytes.size());
    return crc.checksum();
}

bool IsBefore(const FrameSource::Frame& a, const FrameSource::Frame& b)
{
    if (!a || !b)
        return a.has_value();
    return std::tie(a->timeMs, a->position) < std::tie(b->timeMs, b->position);
}

} // namespace

const char* const FrameRecord::HEADING =
    " number  stream  key          time         shown      size    position     crc32\n";
const char* const FrameRecord::CSV_HEADING = "number,stream,keyframe,time_ms,presentation_ms,size,position,crc32\n";

FrameRecord::FrameRecord(const flvdmx::Frame& frame)
    : stream(frame.stream), keyframe(frame.keyframe), timeMs(frame.time.count()),
      shownMs(frame.presentation_time().count()), size(frame.data.size()), position(frame.position),
      crc(Crc32(frame.data))
{
}

std::string FrameRecord::Line(uint64_t number) const
{
    return fmt::format("{:>7}  {:<6}  {:<3}  {:>12}  {:>12}  {:>8}  {:>10}  {:08x}\n", number, StreamName(stream),
                       keyframe && IsVideo() ? "key" : "", FormatTime(timeMs), FormatTime(shownMs), size, position,
                       crc);
}

std::string FrameRecord::Csv(uint64_t number) const
{
    return fmt::format("{},{},{:d},{},{},{},{},{:08x}\n", number, StreamName(stream), keyframe, timeMs, shownMs, size,
                       position, crc);
}

Json FrameRecord::Object(uint64_t number) const
{
    return {{"number", number},     {"stream", StreamName(stream)},       {"keyframe", keyframe},
            {"time_ms", timeMs},    {"presentation_ms", shownMs},         {"size", size},
            {"position", position}, {"crc32", fmt::format("{:08x}", crc)}};
}

// The library also delivers frames of a stream that starts too late for the open to find it, without a configuration.
std::optional<flvdmx::Frame> NextFrame(Input& input, flvdmx::Stream stream)
{
    for (;;) {
        const flvdmx::result<flvdmx::Frame> frame = input.file.next_frame(stream);
        if (frame.error().kind() == flvdmx::Kind::failed)
            throw FileError(input.name, frame.error());
        if (!frame)
            return std::nullopt;
        if (input.Has(frame->stream))
            return *frame;
    }
}

FrameSource::FrameSource(Input& input, uint32_t streams, Played* played)
    : m_input(input), m_streams(streams),
      m_played(played), m_video{flvdmx::Stream::video,
                                (streams & FLVD_STREAM_VIDEO) != 0 && input.Has(flvdmx::Stream::video)},
      m_audio{flvdmx::Stream::audio, (streams & FLVD_STREAM_AUDIO) != 0 && input.Has(flvdmx::Stream::audio)}
{
}

void FrameSource::Refresh()
{
    m_video.ended = false;
    m_audio.ended = false;
}

void FrameSource::Fill(Lane& lane)
{
    if (!lane.wanted || lane.ended || lane.frame)
        return;
    const std::optional<flvdmx::Frame> frame = NextFrame(m_input, lane.stream);
    lane.ended = !frame;
    if (frame)
        lane.frame.emplace(*frame);
}

FrameSource::Frame FrameSource::NextOfOne()
{
    while (const std::optional<flvdmx::Frame> frame = NextFrame(m_input)) {
        if (m_played != nullptr)
            m_played->Take(*frame);
        if ((static_cast<uint32_t>(frame->stream) & m_streams) != 0)
            return FrameRecord(*frame);
    }
    return std::nullopt;
}

FrameSource::Frame FrameSource::Next()
{
    if ((m_input.Instance().options & FLVD_OPT_SEPARATE_AUDIO_READER) == 0)
        return NextOfOne();
    Fill(m_video);
    Fill(m_audio);
    Lane& next = IsBefore(m_video.frame, m_audio.frame) ? m_video : m_audio;
    return std::exchange(next.frame, std::nullopt);
}

} // namespace tool
