// Seeks and queries of the source pads, which arrive from any thread.

#include "streaming.h"

#include "open_lock.h"

#include <algorithm>
#include <shared_mutex>

namespace flvdmx_gst {

namespace {

// Pushes an event from all source pads, even while the streaming thread is busy.
void push_downstream(GstElement* element, GstEvent* event)
{
    const auto push = [](GstElement*, GstPad* pad, gpointer shared) -> gboolean {
        gst_pad_push_event(pad, gst_event_ref(static_cast<GstEvent*>(shared)));
        return TRUE;
    };
    gst_element_foreach_src_pad(element, push, event);
    gst_event_unref(event);
}

} // namespace

gboolean Streaming::handle_event(GstPad* pad, GstObject* parent, GstEvent* event)
{
    if (GST_EVENT_TYPE(event) != GST_EVENT_SEEK)
        return gst_pad_event_default(pad, parent, event);
    const bool done = static_cast<Streaming*>(gst_pad_get_element_private(pad))->seek(event);
    gst_event_unref(event);
    return done ? TRUE : FALSE;
}

gboolean Streaming::handle_query(GstPad* pad, GstObject* parent, GstQuery* query)
{
    const bool done = static_cast<Streaming*>(gst_pad_get_element_private(pad))->answer(query);
    return done ? TRUE : gst_pad_query_default(pad, parent, query);
}

// Returns nothing for a seek that is not supported.
std::optional<Streaming::SeekRequest> Streaming::parse_seek(GstEvent* event) const
{
    SeekRequest request;
    GstFormat format = GST_FORMAT_UNDEFINED;
    GstSeekType stop_type = GST_SEEK_TYPE_NONE;
    gst_event_parse_seek(event, &request.rate, &format, &request.flags, &request.start_type, &request.start, &stop_type,
                         &request.stop);
    if (!m_seekable || format != GST_FORMAT_TIME || request.rate <= 0.0 ||
        (request.flags & GST_SEEK_FLAG_INSTANT_RATE_CHANGE) != 0)
        return {};
    GST_OBJECT_LOCK(m_element);
    const GstSegment segment = m_segment;
    GST_OBJECT_UNLOCK(m_element);
    const auto resolve = [&segment](GstSeekType type, gint64 time, guint64 current) {
        if (type == GST_SEEK_TYPE_NONE)
            return static_cast<gint64>(current);
        const auto duration = static_cast<gint64>(segment.duration);
        return type == GST_SEEK_TYPE_END ? std::max<gint64>(duration + std::min<gint64>(time, 0), 0) : time;
    };
    const guint64 position = std::max<GstClockTime>(m_position, segment.start);
    request.start = std::max<gint64>(resolve(request.start_type, request.start, position), 0);
    request.stop = std::max<gint64>(resolve(stop_type, request.stop, segment.stop), -1);
    if (request.stop >= 0 && request.stop < request.start) {
        if (stop_type != GST_SEEK_TYPE_NONE)
            return {};
        request.stop = -1; // the end of an earlier segment
    }
    if (request.start_type == GST_SEEK_TYPE_END)
        request.start_type = GST_SEEK_TYPE_SET;
    return request;
}

bool Streaming::seek(GstEvent* event)
{
    const std::optional<SeekRequest> request = parse_seek(event);
    if (!request)
        return false;
    const bool flushes = (request->flags & GST_SEEK_FLAG_FLUSH) != 0;
    const guint32 sequence = gst_event_get_seqnum(event);
    if (m_last_seek.exchange(sequence) == sequence)
        return true;
    ++m_waiting_seeks;
    const unsigned flush = flushes ? begin_flush(sequence) : 0;
    if (!flushes)
        gst_pad_pause_task(m_sink);

    const StreamLock lock(m_sink);
    --m_waiting_seeks;
    m_source.clear_flow();
    const bool is_latest = !flushes || end_flush(flush, sequence);
    if (!m_active || !m_file.is_open())
        return false;
    if (!is_latest)
        return true; // a later seek takes over
    GstSegment segment = m_segment;
    segment.position = std::max<GstClockTime>(m_position, segment.start);
    const bool sought = gst_segment_do_seek(&segment, request->rate, GST_FORMAT_TIME, request->flags,
                                            request->start_type, static_cast<guint64>(request->start),
                                            GST_SEEK_TYPE_SET, static_cast<guint64>(request->stop), nullptr) != FALSE &&
                        seek_file(segment, request->flags);
    if (!sought && m_source.flow() == GST_FLOW_FLUSHING)
        return false; // interrupted by a later seek or by stopping
    if (sought) {
        m_sequence = sequence;
        m_timeline.jump(flvdmx::Milliseconds(m_position / GST_MSECOND));
        GST_OBJECT_LOCK(m_element);
        m_segment = segment;
        GST_OBJECT_UNLOCK(m_element);
    } else if (flushes) {
        continue_after_flush();
    }
    restart();
    return sought;
}

// A flush sets the running time to 0, so that the segment has to begin at the position that playing continues from.
void Streaming::continue_after_flush()
{
    GST_OBJECT_LOCK(m_element);
    m_segment.start = m_segment.time = m_segment.position = std::max<GstClockTime>(m_position, m_segment.start);
    m_segment.base = m_segment.offset = 0;
    GST_OBJECT_UNLOCK(m_element);
}

// Moves the reader to the start of the segment; with KEY_UNIT, also moves the segment to the keyframe reached.
bool Streaming::seek_file(GstSegment& segment, GstSeekFlags flags)
{
    constexpr auto to_end = flvdmx::SeekMode::backward | flvdmx::SeekMode::to_end_on_miss;
    const bool after = (flags & GST_SEEK_FLAG_KEY_UNIT) != 0 && (flags & GST_SEEK_FLAG_SNAP_AFTER) != 0;
    const flvdmx::Milliseconds target((segment.position + (after ? GST_MSECOND - 1 : 0)) / GST_MSECOND);
    const std::shared_lock<OpenLock> lock(open_lock);
    const auto reached = target > m_info.duration ? m_file.seek(target, to_end) : go_to_keyframe(target, flags);
    if (m_source.flow() != GST_FLOW_OK)
        return false;
    if (!reached)
        return target > m_info.duration && reached.error().kind() == flvdmx::Kind::miss;
    m_position = to_clock_time(*reached);
    if ((flags & GST_SEEK_FLAG_KEY_UNIT) != 0)
        segment.start = segment.time = segment.position = m_position;
    if (GST_CLOCK_TIME_IS_VALID(segment.stop) && segment.stop < segment.start)
        segment.stop = segment.start;
    return true;
}

// SNAP_AFTER goes to the last keyframe if there is none after the target, so that there is something to play.
flvdmx::result<flvdmx::Milliseconds> Streaming::go_to_keyframe(flvdmx::Milliseconds target, GstSeekFlags flags)
{
    const bool snaps = (flags & GST_SEEK_FLAG_KEY_UNIT) != 0;
    const int snap = snaps ? flags & GST_SEEK_FLAG_SNAP_NEAREST : 0;
    const auto before = go_to(target, flvdmx::SeekMode::backward);
    if (!before || (snap & GST_SEEK_FLAG_SNAP_AFTER) == 0)
        return before;
    const auto after = go_to(target, flvdmx::SeekMode::forward);
    if (!after)
        return before;
    const bool before_is_nearer = snap == GST_SEEK_FLAG_SNAP_NEAREST && target - *before < *after - target;
    return before_is_nearer ? go_to(target, flvdmx::SeekMode::backward) : after;
}

// If the index turns out to be wrong, seeks without it. That search ends at a long hole in the file: then goes to a
// keyframe that is further back, as playing crosses the hole.
flvdmx::result<flvdmx::Milliseconds> Streaming::go_to(flvdmx::Milliseconds target, flvdmx::SeekMode mode)
{
    const auto failed = [this](const flvdmx::result<flvdmx::Milliseconds>& result) {
        return !result && result.error().kind() == flvdmx::Kind::failed && m_source.flow() == GST_FLOW_OK;
    };
    const auto reached = m_file.seek(target, mode);
    if (!failed(reached))
        return reached;
    m_file.ignore_index();
    auto scanned = m_file.seek(target, mode);
    while (failed(scanned) && mode == flvdmx::SeekMode::backward && target.count() > 0)
        scanned = m_file.seek(target /= 2, mode);
    return scanned;
}

// Continues from the position of the reader. A failed seek has not changed it.
void Streaming::restart()
{
    m_next_tag = -1;
    m_segment_is_new = true;
    for (Output& output : m_outputs)
        output.jump(m_position, m_segment.start);
    gst_flow_combiner_reset(m_combiner.get());
    if ((m_segment.flags & GST_SEGMENT_FLAG_SEGMENT) != 0) {
        GstMessage* const message = gst_message_new_segment_start(GST_OBJECT(m_element), GST_FORMAT_TIME,
                                                                  static_cast<gint64>(m_segment.position));
        gst_message_set_seqnum(message, m_sequence);
        gst_element_post_message(m_element, message);
    }
    start_task();
    if (m_waiting_seeks != 0) // the task would keep the stream lock from a seek that has paused it
        gst_pad_pause_task(m_sink);
}

// Interrupts the streaming thread if it waits. The flushes of two seeks may overlap: the later one ends both.
unsigned Streaming::begin_flush(guint32 sequence)
{
    const std::lock_guard<std::mutex> lock(m_flush_mutex);
    GstEvent* const event = gst_event_new_flush_start();
    gst_event_set_seqnum(event, sequence);
    gst_pad_push_event(m_sink, gst_event_ref(event));
    push_downstream(m_element, event);
    return ++m_flushes;
}

// Returns false if another flush has begun since.
bool Streaming::end_flush(unsigned number, guint32 sequence)
{
    const std::lock_guard<std::mutex> lock(m_flush_mutex);
    if (number != m_flushes)
        return false;
    GstEvent* const event = gst_event_new_flush_stop(TRUE);
    gst_event_set_seqnum(event, sequence);
    gst_pad_push_event(m_sink, gst_event_ref(event));
    push_downstream(m_element, event);
    return true;
}

bool Streaming::answer(GstQuery* query) const
{
    GST_OBJECT_LOCK(m_element);
    const GstSegment segment = m_segment;
    GST_OBJECT_UNLOCK(m_element);
    const auto duration = static_cast<gint64>(segment.duration); // GST_CLOCK_TIME_NONE is -1
    GstFormat format = GST_FORMAT_TIME;
    switch (GST_QUERY_TYPE(query)) {
    case GST_QUERY_POSITION: {
        gst_query_parse_position(query, &format, nullptr);
        const guint64 last = GST_CLOCK_TIME_IS_VALID(segment.stop) ? segment.stop : GST_CLOCK_TIME_NONE;
        const guint64 position = gst_segment_to_stream_time(
            &segment, GST_FORMAT_TIME, std::clamp<guint64>(m_position, segment.start, std::max(last, segment.start)));
        if (format == GST_FORMAT_TIME)
            gst_query_set_position(query, format, static_cast<gint64>(position));
        return format == GST_FORMAT_TIME;
    }
    case GST_QUERY_DURATION:
        gst_query_parse_duration(query, &format, nullptr);
        if (format == GST_FORMAT_TIME && duration >= 0)
            gst_query_set_duration(query, format, duration);
        return format == GST_FORMAT_TIME && duration >= 0;
    case GST_QUERY_SEEKING:
        gst_query_parse_seeking(query, &format, nullptr, nullptr, nullptr);
        gst_query_set_seeking(query, format, format == GST_FORMAT_TIME && m_seekable ? TRUE : FALSE, 0, duration);
        return true;
    case GST_QUERY_SEGMENT: {
        const bool open_end = !GST_CLOCK_TIME_IS_VALID(segment.stop);
        const guint64 start = gst_segment_to_stream_time(&segment, GST_FORMAT_TIME, segment.start);
        const guint64 stop =
            open_end ? segment.duration : gst_segment_to_stream_time(&segment, GST_FORMAT_TIME, segment.stop);
        gst_query_set_segment(query, segment.rate, GST_FORMAT_TIME, static_cast<gint64>(start),
                              static_cast<gint64>(stop));
        return true;
    }
    default:
        return false;
    }
}

} // namespace flvdmx_gst
