// The task of the sink pad, which pushes frames. For opening see opening.cpp, for seeks and queries seeking.cpp.

#include "streaming.h"

#include "caps.h"
#include "config.h"
#include "frame_memory.h"
#include "open_lock.h"

#include <algorithm>
#include <shared_mutex>
#include <string>
#include <utility>

namespace flvdmx_gst {

namespace {

constexpr GstClockTime interleave_max = 500 * GST_MSECOND; // how far one stream may be ahead of the other

// FLV adds a byte before VP6 frames that decoders do not expect.
bool is_vp6(flvdmx::VideoCodec codec)
{
    return codec == flvdmx::VideoCodec::vp6 || codec == flvdmx::VideoCodec::vp6_alpha;
}

} // namespace

Streaming::Streaming(GstElement* element, GstPad* sink)
    : m_element(element), m_sink(GST_PAD(gst_object_ref(sink))), m_source(sink),
      m_combiner(gst_flow_combiner_new(), gst_flow_combiner_free)
{
}

Streaming::~Streaming()
{
    gst_object_unref(m_sink);
}

bool Streaming::activate(bool active)
{
    {
        const StreamLock lock(m_sink); // so that a seek in another thread does not restart the task
        m_active = active;
    }
    return active ? start_task() : gst_pad_stop_task(m_sink) != FALSE;
}

bool Streaming::start_task()
{
    const auto turn = [](gpointer streaming) { static_cast<Streaming*>(streaming)->loop(); };
    return gst_pad_start_task(m_sink, turn, this, nullptr) != FALSE;
}

void Streaming::close()
{
    const StreamLock stream_lock(m_sink);
    for (Output& output : m_outputs) {
        if (output.pad() != nullptr)
            gst_element_remove_pad(m_element, output.pad());
        output = Output();
    }
    gst_flow_combiner_clear(m_combiner.get());
    m_position = 0;
    m_next_tag = -1;
    m_warned = {};
    m_timeline = Timeline();
    m_last_seek = GST_SEQNUM_INVALID;
    m_source.reset();
    close_file();
}

void Streaming::loop()
{
    GstFlowReturn flow = m_file.is_open() ? GST_FLOW_OK : open();
    if (flow == GST_FLOW_OK)
        flow = push_frame();
    if (flow != GST_FLOW_OK)
        stop(flow);
}

void Streaming::stop(GstFlowReturn flow)
{
    GST_INFO_OBJECT(m_element, "stopping: %s", gst_flow_get_name(flow));
    gst_pad_pause_task(m_sink);
    if (flow == GST_FLOW_FLUSHING)
        return; // the thread that flushes restarts or stops the task
    if (flow == GST_FLOW_EOS && has_output())
        return finish();
    if (flow == GST_FLOW_EOS)
        GST_ELEMENT_ERROR(m_element, STREAM, DEMUX, (nullptr), ("the file has no frames"));
    else if (flow != flow_reported)
        GST_ELEMENT_FLOW_ERROR(m_element, flow);
    push_to_all(gst_event_new_eos());
}

// Ends the segment, at the end of the file or where a seek has set it.
void Streaming::finish()
{
    push_segment();
    if ((m_segment.flags & GST_SEGMENT_FLAG_SEGMENT) == 0)
        return push_to_all(gst_event_new_eos());
    GstClockTime last = GST_CLOCK_TIME_IS_VALID(m_segment.stop) ? m_segment.stop : m_segment.duration;
    last = GST_CLOCK_TIME_IS_VALID(last) ? last : m_position.load();
    m_position = last; // a seek without a flush continues there
    const auto end = static_cast<gint64>(last);
    GstMessage* const message = gst_message_new_segment_done(GST_OBJECT(m_element), GST_FORMAT_TIME, end);
    gst_message_set_seqnum(message, m_sequence);
    gst_element_post_message(m_element, message);
    push_to_all(gst_event_new_segment_done(GST_FORMAT_TIME, end));
}

GstFlowReturn Streaming::push_frame()
{
    push_segment();
    FrameMemory memory;
    flvdmx::result<flvdmx::Frame> frame{flvdmx::Frame()};
    int64_t end = -1;
    m_source.clear_flow();
    {
        const std::shared_lock<OpenLock> lock(open_lock);
        frame = m_file.next_frame_into([&memory](uint32_t size) { return memory.allocate(size); });
        end = m_file.position();
    }
    if (m_source.flow() != GST_FLOW_OK)
        return source_failed();
    if (!frame && frame.error().kind() != flvdmx::Kind::end)
        return file_failed(frame.error());
    const int64_t position = frame ? frame->position : -1;
    if (position != m_next_tag && m_next_tag >= 0 && goes_back(position))
        return GST_FLOW_OK;
    if (m_source.flow() != GST_FLOW_OK)
        return source_failed();
    m_next_tag = end;
    if (!frame)
        return GST_FLOW_EOS;
    if (const GstFlowReturn flow = has_output() ? GST_FLOW_OK : expose(); flow != GST_FLOW_OK)
        return flow;
    if (m_segment_is_new) // a handler of the new pads has sought
        return GST_FLOW_OK;
    Output& output = output_of(frame->stream);
    if (output.pad() == nullptr) {
        if (!warned_of(frame->stream))
            warn_of_skipped(frame->position);
        return GST_FLOW_OK;
    }
    if (frame->config_changed())
        announce_config(*frame);
    return push_to(output, memory.take(frame->data), *frame);
}

GstFlowReturn Streaming::push_to(Output& output, GstBuffer* buffer, const flvdmx::Frame& frame)
{
    const flvdmx::Milliseconds offset = m_timeline.offset();
    const flvdmx::Milliseconds frame_time = m_timeline.follow(frame);
    if (m_timeline.offset() != offset)
        lengthen();
    const GstClockTime time = to_clock_time(frame_time);
    if (GST_CLOCK_TIME_IS_VALID(m_segment.stop) && time >= m_segment.stop) {
        gst_buffer_unref(buffer);
        const bool ended = time >= m_segment.stop + interleave_max;
        return ended ? GST_FLOW_EOS : gst_flow_combiner_update_pad_flow(m_combiner.get(), output.pad(), GST_FLOW_EOS);
    }
    const size_t own_bytes = frame.stream == flvdmx::Stream::video && is_vp6(m_info.video->codec) ? 1 : 0;
    if (frame.data.size() <= own_bytes) { // decoders mistake an empty buffer for a failure or the end
        gst_buffer_unref(buffer);
        return GST_FLOW_OK;
    }
    gst_buffer_resize(buffer, static_cast<gssize>(own_bytes), static_cast<gssize>(frame.data.size() - own_bytes));
    m_position = time;
    const GstFlowReturn flow = output.push(buffer, frame, frame_time);
    for (Output& other : m_outputs)
        other.reach(time, m_sequence);
    return gst_flow_combiner_update_pad_flow(m_combiner.get(), output.pad(), flow);
}

// Called when the library did not continue right after the previous frame: it skipped tags without frames, tags that it
// does not deliver, or damage. `position` is that of the next frame, -1 at the end. Returns true if the reader goes
// back to read what was skipped.
bool Streaming::goes_back(int64_t position)
{
    bool whole = true;
    if (position >= 0) {
        const std::shared_lock<OpenLock> lock(open_lock);
        whole = m_file.has_whole_tags(m_next_tag, position);
    }
    if (whole && position >= 0)
        return false;
    if (is_before_restart(m_source, m_next_tag, m_file)) {
        GST_INFO_OBJECT(m_element, "the timestamps restart after byte %" G_GINT64_FORMAT, m_next_tag);
        m_seekable = false;
        m_file.accept_restart(m_next_tag);
        if (!has_output())
            m_timeline.start_at_first_frame();
        return true;
    }
    warn_of_skipped(m_next_tag);
    if (!whole) {
        GST_INFO_OBJECT(m_element, "damage at byte %" G_GINT64_FORMAT ", next frame at %" G_GINT64_FORMAT, m_next_tag,
                        position);
        for (Output& output : m_outputs)
            output.mark_damage();
    }
    return false;
}

// Warns once per stream why its tags are not played.
void Streaming::warn_of_skipped(int64_t position)
{
    std::optional<flvdmx::Tag> tag;
    if (m_warned[0] && m_warned[1])
        return;
    for (int i = 0; i < examined_tags && (tag = read_tag(m_source, position)); ++i, position = tag->end()) {
        bool& warned = warned_of(tag->stream());
        const std::string reason = warned ? "" : reason_to_skip(*tag, m_file, m_info);
        if (reason.empty())
            continue;
        warned = true;
        GST_ELEMENT_WARNING(m_element, STREAM, FORMAT, (nullptr),
                            ("from byte %" G_GINT64_FORMAT " on, %s", position, reason.c_str()));
    }
}

// Extends the duration after a restart of the timestamps: the rest of the file comes after what has been played.
void Streaming::lengthen()
{
    const flvdmx::Milliseconds offset = m_timeline.offset();
    if (m_info.duration.count() == 0 || offset.count() < 0)
        return;
    GST_OBJECT_LOCK(m_element);
    m_segment.duration = std::max(m_segment.duration, to_clock_time(m_info.duration + offset));
    GST_OBJECT_UNLOCK(m_element);
    gst_element_post_message(m_element, gst_message_new_duration_changed(GST_OBJECT(m_element)));
}

void Streaming::announce_config(const flvdmx::Frame& frame)
{
    const bool video = frame.stream == flvdmx::Stream::video;
    const bool valid =
        video ? set_config(*m_info.video, frame.new_config) : set_config(*m_info.audio, frame.new_config);
    if (!valid)
        GST_ELEMENT_WARNING(m_element, STREAM, FORMAT, (nullptr),
                            ("the %s configuration before byte %" G_GINT64_FORMAT " is damaged and not used",
                             video ? "video" : "audio", frame.position));
    OwnedCaps caps(video ? make_caps(*m_info.video) : make_caps(*m_info.audio));
    if (valid && caps != nullptr)
        output_of(frame.stream).change_caps(std::move(caps), m_sequence);
}

// Handles a failure of the source. A flush is not an error: the thread that flushes restarts or stops the task.
GstFlowReturn Streaming::source_failed()
{
    const GstFlowReturn flow = m_source.flow();
    if (flow == GST_FLOW_FLUSHING)
        return flow;
    GST_ELEMENT_ERROR(m_element, RESOURCE, READ, (nullptr), ("the source failed: %s", gst_flow_get_name(flow)));
    return flow_reported;
}

GstFlowReturn Streaming::file_failed(const flvdmx::error& error)
{
    GST_ELEMENT_ERROR(m_element, STREAM, DEMUX, (nullptr), ("%s (%s)", error.text(), error.name()));
    return flow_reported;
}

void Streaming::push_segment()
{
    if (!std::exchange(m_segment_is_new, false))
        return;
    GST_INFO_OBJECT(m_element, "%" GST_SEGMENT_FORMAT, &m_segment);
    push_to_all(gst_event_new_segment(&m_segment));
}

void Streaming::push_to_all(GstEvent* event) const
{
    gst_event_set_seqnum(event, m_sequence);
    for (const Output& output : m_outputs)
        if (output.pad() != nullptr)
            gst_pad_push_event(output.pad(), gst_event_ref(event));
    gst_event_unref(event);
}

} // namespace flvdmx_gst
