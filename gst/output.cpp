#include "output.h"

#include <algorithm>
#include <utility>

namespace flvdmx_gst {

namespace {

// How far a stream must lag behind the other one before a gap is announced. `gap_min` is more than the usual distance
// of interleaved streams. A sink that waits for its first buffer blocks the whole pipeline, whose queues may hold less:
// it gets a gap after `first_gap_min`.
constexpr GstClockTime gap_min = 500 * GST_MSECOND;
constexpr GstClockTime first_gap_min = 100 * GST_MSECOND;

} // namespace

Output::Output(GstElement* element, const char* name, OwnedCaps caps)
    : m_pad(gst_pad_new_from_template(gst_element_get_pad_template(element, name), name)), m_caps(std::move(caps))
{
    gst_pad_use_fixed_caps(m_pad);
    gst_pad_set_active(m_pad, TRUE);
}

void Output::start(GstElement* element, guint group, guint32 sequence)
{
    gchar* const id = gst_pad_create_stream_id(m_pad, element, GST_PAD_NAME(m_pad));
    GstEvent* const event = gst_event_new_stream_start(id);
    g_free(id);
    gst_event_set_group_id(event, group);
    push_event(event, sequence);
    push_event(gst_event_new_caps(m_caps.get()), sequence);
}

void Output::change_caps(OwnedCaps caps, guint32 sequence)
{
    if (gst_caps_is_equal(m_caps.get(), caps.get()) != FALSE)
        return;
    m_caps = std::move(caps);
    push_event(gst_event_new_caps(m_caps.get()), sequence);
}

GstFlowReturn Output::push(GstBuffer* buffer, const flvdmx::Frame& frame, flvdmx::Milliseconds time)
{
    GST_BUFFER_DTS(buffer) = to_clock_time(time);
    GST_BUFFER_PTS(buffer) = to_clock_time(time + frame.composition_offset);
    GST_BUFFER_OFFSET(buffer) = static_cast<guint64>(frame.position);
    if (!frame.keyframe)
        GST_BUFFER_FLAG_SET(buffer, GST_BUFFER_FLAG_DELTA_UNIT);
    if (std::exchange(m_discontinuity, false))
        GST_BUFFER_FLAG_SET(buffer, GST_BUFFER_FLAG_DISCONT);
    m_reached = std::max(m_reached, GST_BUFFER_DTS(buffer));
    m_waits = false;
    return gst_pad_push(m_pad, buffer);
}

void Output::jump(GstClockTime time, GstClockTime start)
{
    m_discontinuity = m_waits = true;
    m_reached = time;
    m_start = start;
}

void Output::reach(GstClockTime time, guint32 sequence)
{
    if (m_pad == nullptr || time < m_reached + (m_waits ? first_gap_min : gap_min))
        return;
    const GstClockTime begin = std::max(m_reached, m_start);
    m_reached = time;
    if (std::exchange(m_waits, false) || time > begin)
        push_event(gst_event_new_gap(begin, time > begin ? time - begin : GST_CLOCK_TIME_NONE), sequence);
}

void Output::push_event(GstEvent* event, guint32 sequence)
{
    gst_event_set_seqnum(event, sequence);
    gst_pad_push_event(m_pad, event);
}

} // namespace flvdmx_gst
