// Opens a file, creates the pads for its streams and pushes their first events.

#include "streaming.h"

#include "caps.h"
#include "config.h"
#include "open_lock.h"
#include "tags.h"

#include <algorithm>
#include <shared_mutex>
#include <utility>

namespace flvdmx_gst {

namespace {

constexpr uint32_t cache_size = 16384;
constexpr int back_pointer_size = 4;              // before the first tag
constexpr int64_t frame_size_max = (1 << 24) - 1; // the limit of the format

// Limits of the search for a configuration that does not come before the first frames.
constexpr flvdmx::Milliseconds config_search_time{10'000};
constexpr int config_search_frames = 1000;

guint group_id(GstPad* sink)
{
    guint group = 0;
    GstEvent* start = gst_pad_get_sticky_event(sink, GST_EVENT_STREAM_START, 0);
    const bool has_group = start != nullptr && gst_event_parse_group_id(start, &group) != FALSE;
    gst_clear_event(&start);
    return has_group ? group : gst_util_group_id_next();
}

} // namespace

GstFlowReturn Streaming::open()
{
    m_sequence = gst_util_seqnum_next();
    GstFlowReturn flow = open_file();
    if (flow == GST_FLOW_OK && m_info.audio && m_info.audio->codec == flvdmx::AudioCodec::aac &&
        m_info.audio->config.empty())
        flow = find_config();
    return flow;
}

GstFlowReturn Streaming::open_file()
{
    m_source.clear_flow();
    const int64_t size = m_source.size();
    if (size < 0) {
        GST_ELEMENT_ERROR(m_element, STREAM, DEMUX, (nullptr),
                          ("the source does not report the size of the file in bytes, which flvdmxdemux needs"));
        return flow_reported;
    }
    flvdmx::Options options;
    options.cache_size = cache_size;
    options.index_in_memory = true;
    options.buffer_size = static_cast<uint32_t>(std::clamp<int64_t>(size, 1, frame_size_max));
    m_spare.reset(new uint8_t[options.buffer_size]); // needs no memory until it is written to
    options.buffer = m_spare.get();
    flvdmx::error error;
    {
        const std::lock_guard<OpenLock> lock(open_lock);
        auto file = flvdmx::File::open(m_source.name(), flvdmx::make_host(flvd_callback_host_fill), options);
        error = file.error();
        m_file = *std::move(file);
    }
    if (m_file.is_open()) {
        const std::shared_lock<OpenLock> lock(open_lock);
        m_metadata = *m_file.metadata();
    }
    if (m_source.flow() != GST_FLOW_OK) { // the library may have mistaken the failure for the end of the file
        close_file();
        return source_failed();
    }
    if (!m_file.is_open())
        return file_failed(error);
    m_info = m_file.info();
    m_next_tag = m_file.instance()->data_offset + back_pointer_size;
    const bool has_duration = m_info.duration.count() != 0;
    m_seekable = has_duration && m_info.seek_method != flvdmx::SeekMethod::none;
    if (!has_duration)
        m_timeline.start_at_first_frame();
    return GST_FLOW_OK;
}

// In some AAC streams, the configuration follows the first frames. Reads ahead to find it, then reopens the file.
GstFlowReturn Streaming::find_config()
{
    flvdmx::AudioInfo found = *m_info.audio;
    for (int i = 0; i < config_search_frames && found.config.empty(); ++i) {
        const std::shared_lock<OpenLock> lock(open_lock);
        const auto frame = m_file.next_frame();
        if (!frame || frame->time > config_search_time)
            break;
        if (frame->stream == flvdmx::Stream::audio && frame->config_changed())
            set_config(found, frame->new_config);
    }
    if (m_source.flow() != GST_FLOW_OK)
        return source_failed();
    close_file();
    const GstFlowReturn flow = open_file();
    if (flow == GST_FLOW_OK && m_info.audio)
        m_info.audio = found;
    return flow;
}

void Streaming::close_file()
{
    const std::shared_lock<OpenLock> lock(open_lock);
    m_file.close();
}

// Adds pads for the streams that decoders accept. Called once there is a first frame, as players wait for every pad.
GstFlowReturn Streaming::expose()
{
    if (m_info.video)
        add_output(0, OwnedCaps(make_caps(*m_info.video)));
    if (m_info.audio)
        add_output(1, OwnedCaps(make_caps(*m_info.audio)));
    if (!has_output()) {
        GST_ELEMENT_ERROR(m_element, STREAM, CODEC_NOT_FOUND, (nullptr), ("no stream has a known codec"));
        return flow_reported;
    }
    const guint group = group_id(m_sink);
    for (Output& output : m_outputs)
        if (output.pad() != nullptr)
            output.start(m_element, group, m_sequence);

    GST_OBJECT_LOCK(m_element);
    gst_segment_init(&m_segment, GST_FORMAT_TIME);
    if (m_info.duration.count() != 0)
        m_segment.duration = to_clock_time(m_info.duration);
    GST_OBJECT_UNLOCK(m_element);
    m_segment_is_new = true;
    push_segment();
    push_tags();

    for (const Output& output : m_outputs)
        if (output.pad() != nullptr)
            gst_element_add_pad(m_element, output.pad());
    gst_element_no_more_pads(m_element);
    return GST_FLOW_OK;
}

void Streaming::add_output(size_t index, OwnedCaps caps)
{
    const char* const name = index == 0 ? "video" : "audio";
    if (caps == nullptr) {
        m_warned[index] = true;
        GST_ELEMENT_WARNING(m_element, STREAM, CODEC_NOT_FOUND, (nullptr), ("the %s cannot be decoded", name));
        return;
    }
    GST_INFO_OBJECT(m_element, "%s: %" GST_PTR_FORMAT, name, caps.get());
    m_outputs[index] = Output(m_element, name, std::move(caps));
    GstPad* const pad = m_outputs[index].pad();
    gst_pad_set_event_function(pad, handle_event);
    gst_pad_set_query_function(pad, handle_query);
    gst_pad_set_element_private(pad, this);
    gst_flow_combiner_add_pad(m_combiner.get(), pad);
}

void Streaming::push_tags()
{
    for (const flvdmx::Stream stream : {flvdmx::Stream::video, flvdmx::Stream::audio}) {
        Output& output = output_of(stream);
        if (output.pad() == nullptr)
            continue;
        output.push_event(gst_event_new_tag(make_file_tags(m_metadata)), m_sequence);
        output.push_event(gst_event_new_tag(make_stream_tags(m_metadata, stream, output.caps())), m_sequence);
    }
}

} // namespace flvdmx_gst
