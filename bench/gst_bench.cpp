// Frames per second of GStreamer pipelines that only demultiplex, with our element and with the framework's own:
// flvdmx-gst-bench FOLDER. Prints a JSON array.

#include <gst/gst.h>

#include <chrono>
#include <cstdio>
#include <string>

namespace {

constexpr int PLAYS = 3;

guint64 RenderedBy(GstElement* pipeline, const char* sink)
{
    GstElement* const element = gst_bin_get_by_name(GST_BIN(pipeline), sink);
    GstStructure* stats = nullptr;
    guint64 rendered = 0;
    g_object_get(element, "stats", &stats, nullptr);
    gst_structure_get_uint64(stats, "rendered", &rendered);
    gst_structure_free(stats);
    gst_object_unref(element);
    return rendered;
}

bool WaitFor(GstElement* pipeline, GstMessageType type)
{
    GstBus* const bus = gst_element_get_bus(pipeline);
    const auto wanted = static_cast<GstMessageType>(type | GST_MESSAGE_ERROR);
    GstMessage* const message = gst_bus_timed_pop_filtered(bus, GST_CLOCK_TIME_NONE, wanted);
    const bool is_wanted = GST_MESSAGE_TYPE(message) == type;
    gst_message_unref(message);
    gst_object_unref(bus);
    return is_wanted;
}

// The time includes opening and the first frame.
bool Play(const std::string& path, const char* demuxer, const char* before)
{
    const std::string sink = "fakesink sync=false async=false name=";
    const std::string description =
        "filesrc location=" + path + " ! " + demuxer + " name=d d.video ! " + sink + "v d.audio ! " + sink + "a";
    GstElement* const pipeline = gst_parse_launch(description.c_str(), nullptr);
    const auto start = std::chrono::steady_clock::now();
    gst_element_set_state(pipeline, GST_STATE_PLAYING);
    const bool ended = WaitFor(pipeline, GST_MESSAGE_EOS);
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
    const guint64 frames = RenderedBy(pipeline, "v") + RenderedBy(pipeline, "a");
    std::printf("%s{\"demuxer\": \"%s\", \"seconds\": %.6f, \"frames\": %llu", before, demuxer, taken.count(),
                static_cast<unsigned long long>(frames));
    gst_element_set_state(pipeline, GST_STATE_NULL);
    gst_object_unref(pipeline);
    return ended;
}

} // namespace

int main(int argc, char** argv)
{
    gst_init(&argc, &argv);
    if (argc != 2)
        return std::fputs("usage: flvdmx-gst-bench FOLDER\n", stderr), 2;
    const char* before = "[";
    for (const char* const medium : {"small", "hd"}) {
        for (int i = 0; i < PLAYS; ++i) {
            for (const char* const demuxer : {"flvdmxdemux", "flvdemux"}) {
                if (!Play(std::string(argv[1]) + "/" + medium + ".flv", demuxer, before))
                    return std::fprintf(stderr, "%s cannot play %s\n", demuxer, medium), 1;
                std::printf(", \"medium\": \"%s\"}", medium);
                before = ",\n";
            }
        }
    }
    std::puts("]");
    return 0;
}
