// Plays a file or URI through GStreamer, with flvdmxdemux for FLV files: play FILE [SINK]. SINK is an element for video
// and audio output, such as fakesink.
#include <gst/gst.h>

#include <cstdio>
#include <initializer_list>

static void prefer(const char* name)
{
    GstPluginFeature* const feature = gst_registry_lookup_feature(gst_registry_get(), name);
    if (feature == nullptr)
        return (void)std::fprintf(stderr, "play: %s is not installed; another demuxer will play the file\n", name);
    gst_plugin_feature_set_rank(feature, GST_RANK_PRIMARY + 1);
    gst_object_unref(feature);
}

static gchar* make_uri(const char* file)
{
    return gst_uri_is_valid(file) != FALSE ? g_strdup(file) : gst_filename_to_uri(file, nullptr);
}

// Returns the exit status.
static int play_to_end(GstElement* player)
{
    gst_element_set_state(player, GST_STATE_PLAYING);
    GstBus* const bus = gst_element_get_bus(player);
    const auto awaited = static_cast<GstMessageType>(GST_MESSAGE_EOS | GST_MESSAGE_ERROR);
    GstMessage* const message = gst_bus_timed_pop_filtered(bus, GST_CLOCK_TIME_NONE, awaited);
    const bool failed = GST_MESSAGE_TYPE(message) == GST_MESSAGE_ERROR;
    gint64 duration = 0;
    if (failed) {
        GError* error = nullptr;
        gst_message_parse_error(message, &error, nullptr);
        std::fprintf(stderr, "play: %s\n", error->message);
        g_error_free(error);
    } else if (gst_element_query_duration(player, GST_FORMAT_TIME, &duration) != FALSE) {
        std::printf("played %.3f s\n", static_cast<double>(duration) / GST_SECOND);
    }
    gst_message_unref(message);
    gst_object_unref(bus);
    gst_element_set_state(player, GST_STATE_NULL);
    return failed ? 1 : 0;
}

int main(int argc, char** argv)
{
    gst_init(&argc, &argv);
    if (argc != 2 && argc != 3)
        return std::fputs("usage: play FILE [SINK]\n", stderr), 2;
    prefer("flvdmxdemux");
    GstElement* const player = gst_element_factory_make("playbin3", nullptr);
    if (player == nullptr)
        return std::fputs("play: playbin3 is missing; install gstreamer1.0-plugins-base\n", stderr), 1;
    gchar* const uri = make_uri(argv[1]);
    g_object_set(player, "uri", uri, nullptr);
    g_free(uri);
    if (argc == 3)
        for (const char* const sink : {"video-sink", "audio-sink"})
            g_object_set(player, sink, gst_element_factory_make(argv[2], nullptr), nullptr);
    const int status = play_to_end(player);
    gst_object_unref(player);
    return status;
}
