#include "pipeline.h"

namespace flvd_test {

Pipeline::Pipeline(const std::string& description) : m_pipeline(gst_parse_launch(description.c_str(), nullptr))
{
    GstIterator* const sinks = gst_bin_iterate_all_by_element_factory_name(GST_BIN(m_pipeline), "appsink");
    const auto connect = [](const GValue* item, gpointer pipeline) {
        auto* const sink = static_cast<GstAppSink*>(g_value_get_object(item));
        GstAppSinkCallbacks callbacks{};
        callbacks.new_sample = take;
        callbacks.new_preroll = take_preroll;
        gst_app_sink_set_callbacks(sink, &callbacks, pipeline, nullptr);
    };
    gst_iterator_foreach(sinks, connect, this);
    gst_iterator_free(sinks);
}

Pipeline::~Pipeline()
{
    gst_element_set_state(m_pipeline, GST_STATE_NULL);
    gst_object_unref(m_pipeline);
}

bool Pipeline::go_to(GstState state)
{
    m_keeps_preroll = state == GST_STATE_PAUSED;
    return gst_element_set_state(m_pipeline, state) != GST_STATE_CHANGE_FAILURE &&
           gst_element_get_state(m_pipeline, nullptr, nullptr, 10 * GST_SECOND) != GST_STATE_CHANGE_ASYNC;
}

GstMessage* Pipeline::play_until(int types)
{
    m_keeps_preroll = false;
    gst_element_set_state(m_pipeline, GST_STATE_PLAYING);
    GstBus* const bus = gst_element_get_bus(m_pipeline);
    const int wanted = types | GST_MESSAGE_ERROR;
    GstMessage* const message = gst_bus_timed_pop_filtered(bus, 30 * GST_SECOND, static_cast<GstMessageType>(wanted));
    gst_object_unref(bus);
    return message;
}

std::string Pipeline::play(int types)
{
    GstMessage* const message = play_until(types | GST_MESSAGE_EOS);
    const GstMessageType type = message != nullptr ? GST_MESSAGE_TYPE(message) : GST_MESSAGE_UNKNOWN;
    std::string text = message == nullptr ? "no end within 30 seconds" : "";
    if (type == GST_MESSAGE_ERROR || type == GST_MESSAGE_WARNING) {
        gchar* debug = nullptr;
        GError* error = nullptr;
        (type == GST_MESSAGE_ERROR ? gst_message_parse_error : gst_message_parse_warning)(message, &error, &debug);
        text = std::string(error->message) + ": " + (debug != nullptr ? debug : "");
        g_error_free(error);
        g_free(debug);
    }
    gst_clear_message(const_cast<GstMessage**>(&message));
    return text;
}

bool Pipeline::seek(int64_t start, int flags, int64_t stop, double rate)
{
    const auto nanoseconds = [](int64_t time) { return time < 0 ? -1 : time * static_cast<int64_t>(GST_MSECOND); };
    return gst_element_seek(m_pipeline, rate, GST_FORMAT_TIME, static_cast<GstSeekFlags>(flags), GST_SEEK_TYPE_SET,
                            nanoseconds(start), GST_SEEK_TYPE_SET, nanoseconds(stop)) != FALSE;
}

std::vector<Arrival> Pipeline::arrivals(const char* sink)
{
    const std::lock_guard<std::mutex> lock(m_mutex);
    return m_arrivals[sink];
}

GstClockTime Pipeline::last_time(const char* sink)
{
    const std::lock_guard<std::mutex> lock(m_mutex);
    return m_arrivals[sink].empty() ? 0 : m_arrivals[sink].back().dts;
}

void Pipeline::forget_arrivals()
{
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_arrivals.clear();
}

GstFlowReturn Pipeline::take(GstAppSink* sink, gpointer pipeline)
{
    static_cast<Pipeline*>(pipeline)->keep(sink, gst_app_sink_pull_sample(sink));
    return GST_FLOW_OK;
}

// The buffer arrives again when the pipeline plays.
GstFlowReturn Pipeline::take_preroll(GstAppSink* sink, gpointer pipeline)
{
    GstSample* const sample = gst_app_sink_pull_preroll(sink);
    auto* const self = static_cast<Pipeline*>(pipeline);
    if (self->m_keeps_preroll)
        self->keep(sink, sample);
    else
        gst_sample_unref(sample);
    return GST_FLOW_OK;
}

void Pipeline::keep(GstAppSink* sink, GstSample* sample)
{
    GstBuffer* const buffer = gst_sample_get_buffer(sample);
    GstMapInfo map{};
    gst_buffer_map(buffer, &map, GST_MAP_READ);
    gchar* const checksum = g_compute_checksum_for_data(G_CHECKSUM_MD5, map.data, map.size);
    gchar* const caps = gst_caps_to_string(gst_sample_get_caps(sample));
    {
        const std::lock_guard<std::mutex> lock(m_mutex);
        m_arrivals[GST_OBJECT_NAME(sink)].push_back(
            {GST_BUFFER_DTS(buffer), GST_BUFFER_PTS(buffer), GST_BUFFER_OFFSET(buffer),
             GST_BUFFER_FLAG_IS_SET(buffer, GST_BUFFER_FLAG_DISCONT) != FALSE,
             GST_BUFFER_FLAG_IS_SET(buffer, GST_BUFFER_FLAG_DELTA_UNIT) != FALSE, gst_sample_get_segment(sample)->start,
             gst_sample_get_segment(sample)->base, checksum, caps});
    }
    g_free(caps);
    g_free(checksum);
    gst_buffer_unmap(buffer, &map);
    gst_sample_unref(sample);
}

std::string demuxed(const std::string& path, const std::string& video, const std::string& audio,
                    const std::string& demuxer)
{
    std::string words = "filesrc location=" + path + " ! " + demuxer + " name=d";
    for (const auto& [pad, branch] : {std::pair{"video", video}, std::pair{"audio", audio}})
        if (!branch.empty())
            words +=
                std::string(" d.") + pad + " ! queue max-size-time=0 max-size-bytes=0 max-size-buffers=0 ! " + branch;
    return words;
}

} // namespace flvd_test
