#include "timeline.h"

#include <algorithm>
#include <utility>

namespace flvdmx_gst {

namespace {

// Timestamps of a stream that go back by at most this were written out of order; by more, they restart.
constexpr flvdmx::Milliseconds jitter_max{1000};

flvdmx::Milliseconds distance(flvdmx::Milliseconds one, flvdmx::Milliseconds other)
{
    return one > other ? one - other : other - one;
}

} // namespace

void Timeline::jump(flvdmx::Milliseconds time)
{
    *this = Timeline();
    m_latest = time;
}

void Timeline::start_at_first_frame()
{
    m_starts_at_first_frame = true;
}

flvdmx::Milliseconds Timeline::follow(const flvdmx::Frame& frame)
{
    if (std::exchange(m_starts_at_first_frame, false))
        m_offset = -frame.time;
    Stream& stream = m_streams[frame.stream == flvdmx::Stream::video ? 0 : 1];
    if (!stream.last || distance(frame.time + m_offset, m_latest) <= distance(frame.time + stream.offset, m_latest))
        stream.offset = m_offset;
    const flvdmx::Milliseconds least = stream.last.value_or(flvdmx::Milliseconds(0)) - jitter_max;
    if (frame.time + stream.offset < least)
        stream.offset = m_offset = m_latest + stream.distance - frame.time;
    const flvdmx::Milliseconds time = std::max(frame.time + stream.offset, flvdmx::Milliseconds(0));
    if (stream.last && time > *stream.last)
        stream.distance = time - *stream.last;
    stream.last = time;
    m_latest = std::max(m_latest, time);
    return time;
}

} // namespace flvdmx_gst
