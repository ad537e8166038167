// Opening a file and pushing its frames. Seeks and queries are in seeking.cpp.

#include "streaming.h"

#include "caps.h"
#include "open_lock.h"
#include "tags.h"

#include <algorithm>
#include <shared_mutex>
#include <utility>

namespace flvdmx_gst {

namespace {

constexpr uint32_t cache_size = 16384;
constexpr int64_t frame_size_max = (1 << 24) - 1;          // the format's own limit
constexpr GstClockTime interleave_max = 500 * GST_MSECOND; // how far one stream may be ahead of the other in a file
constexpr GstFlowReturn flow_told = GST_FLOW_CUSTOM_ERROR; // a failure whose message was posted

// The memory of a buffer, mapped until a frame was written there.
class FrameMemory {
public:
    FrameMemory() = default;
    FrameMemory(const FrameMemory&) = delete;
    FrameMemory& operator=(const FrameMemory&) = delete;
    ~FrameMemory()
    {
        unmap();
        gst_clear_buffer(&m_buffer);
    }

    uint8_t* allocate(size_t size)
    {
        m_buffer = gst_buffer_new_allocate(nullptr, size, nullptr);
        if (m_buffer != nullptr)
            gst_buffer_map(m_buffer, &m_map, GST_MAP_WRITE);
        return m_map.data;
    }

    // A buffer with the frame: the one that it was written to, mostly.
    GstBuffer* take(const flvdmx::Bytes& frame)
    {
        const bool is_there = frame.data() == m_map.data;
        unmap();
        if (is_there)
            return std::exchange(m_buffer, nullptr);
        GstBuffer* const buffer = gst_buffer_new_allocate(nullptr, frame.size(), nullptr);
        gst_buffer_fill(buffer, 0, frame.data(), frame.size());
        return buffer;
    }

private:
    void unmap()
    {
        if (m_map.data != nullptr)
            gst_buffer_unmap(m_buffer, &m_map);
        m_map = {};
    }

    GstBuffer* m_buffer = nullptr;
    GstMapInfo m_map{};
};

// Puts the picture size of an AVC configuration into the description; 0 when it cannot be read.
void read_picture_size(flvdmx::VideoInfo& info)
{
    std::array<uint8_t, 1024> sets{};
    const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(info.config.data(), static_cast<int32_t>(info.config.size()),
                                                      sets.data(), static_cast<int32_t>(sets.size()));
    flvd_video_info_t picture{};
    const std::lock_guard<OpenLock> lock(open_lock); // the reader is one for the process
    FLVD_ParseVideoHeader(static_cast<int32_t>(info.codec), sets.data(), size, &picture);
    info.width = picture.width;
    info.height = picture.height;
}

// FLV puts a byte of its own before the frames, which decoders do not expect.
bool is_vp6(flvdmx::VideoCodec codec)
{
    return codec == flvdmx::VideoCodec::vp6 || codec == flvdmx::VideoCodec::vp6_alpha;
}

guint group_id(GstPad* sink)
{
    guint group = 0;
    GstEvent* start = gst_pad_get_sticky_event(sink, GST_EVENT_STREAM_START, 0);
    const bool has_group = start != nullptr && gst_event_parse_group_id(start, &group) != FALSE;
    gst_clear_event(&start);
    return has_group ? group : gst_util_group_id_next();
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
        const StreamLock lock(m_sink); // a seek that is running does not start the task again
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
    m_last_seek = GST_SEQNUM_INVALID;
    m_source.reset();
    const std::shared_lock<OpenLock> lock(open_lock);
    m_file.close();
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
    GST_INFO_OBJECT(m_element, "stops: %s", gst_flow_get_name(flow));
    gst_pad_pause_task(m_sink);
    if (flow == GST_FLOW_FLUSHING)
        return; // whoever flushes says what comes next
    if (flow == GST_FLOW_EOS)
        return finish();
    if (flow != flow_told)
        GST_ELEMENT_FLOW_ERROR(m_element, flow);
    push_to_all(gst_event_new_eos());
}

// The end of the segment, which is that of the file unless a seek has set another.
void Streaming::finish()
{
    push_segment();
    if ((m_segment.flags & GST_SEGMENT_FLAG_SEGMENT) == 0)
        return push_to_all(gst_event_new_eos());
    const auto end = static_cast<gint64>(GST_CLOCK_TIME_IS_VALID(m_segment.stop) ? m_segment.stop : m_segment.duration);
    GstMessage* const message = gst_message_new_segment_done(GST_OBJECT(m_element), GST_FORMAT_TIME, end);
    gst_message_set_seqnum(message, m_sequence);
    gst_element_post_message(m_element, message);
    push_to_all(gst_event_new_segment_done(GST_FORMAT_TIME, end));
}

GstFlowReturn Streaming::open()
{
    flvdmx::error error;
    m_sequence = gst_util_seqnum_next();
    m_source.clear_flow();
    {
        const std::lock_guard<OpenLock> lock(open_lock);
        flvdmx::Options options;
        options.cache_size = cache_size;
        options.index_in_memory = true;
        options.buffer_size = static_cast<uint32_t>(std::clamp<int64_t>(m_source.size(), 1, frame_size_max));
        m_spare.reset(new uint8_t[options.buffer_size]); // takes memory when it is written to
        options.buffer = m_spare.get();
        auto file = flvdmx::File::open(m_source.name(), flvdmx::make_host(flvd_callback_host_fill), options);
        error = file.error();
        m_file = *std::move(file);
    }
    if (const GstFlowReturn flow = m_source.flow(); flow != GST_FLOW_OK) {
        close();
        return flow;
    }
    if (!m_file.is_open()) {
        GST_ELEMENT_ERROR(m_element, STREAM, DEMUX, (nullptr), ("%s (%s)", error.text(), error.name()));
        return flow_told;
    }
    m_info = m_file.info();
    return expose();
}

// Announces the streams that decoders can take.
GstFlowReturn Streaming::expose()
{
    if (m_info.video)
        add_output(0, OwnedCaps(make_caps(*m_info.video)));
    if (m_info.audio)
        add_output(1, OwnedCaps(make_caps(*m_info.audio)));
    if (!has_output()) {
        GST_ELEMENT_ERROR(m_element, STREAM, CODEC_NOT_FOUND, (nullptr), ("no stream of a codec that is known"));
        return flow_told;
    }
    const guint group = group_id(m_sink);
    for (Output& output : m_outputs)
        if (output.pad() != nullptr)
            output.start(m_element, group);

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
    flvdmx::result<flvdmx::Metadata> metadata{flvdmx::Metadata()};
    {
        const std::shared_lock<OpenLock> lock(open_lock);
        metadata = m_file.metadata();
    }
    GstEvent* const event = gst_event_new_tag(make_file_tags(*metadata));
    for (const flvdmx::Stream stream : {flvdmx::Stream::video, flvdmx::Stream::audio}) {
        const Output& output = output_of(stream);
        if (output.pad() == nullptr)
            continue;
        gst_pad_push_event(output.pad(), gst_event_ref(event));
        gst_pad_push_event(output.pad(), gst_event_new_tag(make_stream_tags(*metadata, stream, output.caps())));
    }
    gst_event_unref(event);
}

GstFlowReturn Streaming::push_frame()
{
    push_segment();
    FrameMemory memory;
    flvdmx::result<flvdmx::Frame> frame{flvdmx::Frame()};
    m_source.clear_flow();
    {
        const std::shared_lock<OpenLock> lock(open_lock);
        frame = m_file.next_frame_into([&memory](uint32_t size) { return memory.allocate(size); });
        if (frame && frame->position != m_next_tag)
            find_damage(frame->position);
        m_next_tag = __FLV_DMX__fioTell64(m_file.instance()->main_reader);
    }
    if (m_source.flow() != GST_FLOW_OK)
        return m_source.flow();
    if (!frame && frame.error().kind() == flvdmx::Kind::end)
        return GST_FLOW_EOS;
    if (!frame) {
        const flvdmx::error error = frame.error();
        GST_ELEMENT_ERROR(m_element, STREAM, DEMUX, (nullptr), ("%s (%s)", error.text(), error.name()));
        return flow_told;
    }
    Output& output = output_of(frame->stream);
    if (output.pad() == nullptr)
        return GST_FLOW_OK;
    if (frame->config_changed())
        announce_config(*frame);
    return push_to(output, memory.take(frame->data), *frame);
}

GstFlowReturn Streaming::push_to(Output& output, GstBuffer* buffer, const flvdmx::Frame& frame)
{
    const GstClockTime time = to_clock_time(std::max(frame.time, flvdmx::Milliseconds(0)));
    if (GST_CLOCK_TIME_IS_VALID(m_segment.stop) && time >= m_segment.stop) {
        gst_buffer_unref(buffer);
        const bool ended = time >= m_segment.stop + interleave_max;
        return ended ? GST_FLOW_EOS : gst_flow_combiner_update_pad_flow(m_combiner.get(), output.pad(), GST_FLOW_EOS);
    }
    if (frame.stream == flvdmx::Stream::video && is_vp6(m_info.video->codec) && frame.data.size() > 1)
        gst_buffer_resize(buffer, 1, static_cast<gssize>(frame.data.size()) - 1);
    m_position = time;
    const GstFlowReturn flow = output.push(buffer, frame);
    for (Output& other : m_outputs)
        other.reach(time);
    return gst_flow_combiner_update_pad_flow(m_combiner.get(), output.pad(), flow);
}

// A frame was found elsewhere than after the one before: after damage, or after tags that carry no frame.
void Streaming::find_damage(int64_t position)
{
    if (m_next_tag < 0 || m_file.has_whole_tags(m_next_tag, position))
        return;
    GST_INFO_OBJECT(m_element, "damage at byte %" G_GINT64_FORMAT ", next frame at %" G_GINT64_FORMAT, m_next_tag,
                    position);
    for (Output& output : m_outputs)
        output.mark_damage();
}

void Streaming::announce_config(const flvdmx::Frame& frame)
{
    const std::vector<uint8_t> config(frame.new_config.begin(), frame.new_config.end());
    OwnedCaps caps;
    if (frame.stream == flvdmx::Stream::video) {
        m_info.video->config = config;
        read_picture_size(*m_info.video);
        caps.reset(make_caps(*m_info.video));
    } else {
        m_info.audio->config = config;
        flvd_audio_info_t sound{};
        FLVD_ParseAudioHeader(static_cast<int32_t>(m_info.audio->codec), config.data(),
                              static_cast<int32_t>(config.size()), &sound);
        m_info.audio->sample_rate = sound.sample_rate;
        m_info.audio->channels = sound.channels;
        caps.reset(make_caps(*m_info.audio));
    }
    GST_INFO_OBJECT(m_element, "changes to %" GST_PTR_FORMAT, caps.get());
    if (caps != nullptr)
        output_of(frame.stream).change_caps(std::move(caps));
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
