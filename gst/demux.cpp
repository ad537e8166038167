// The element's class and pads. Streaming does the work.

#include "demux.h"

#include "caps.h"
#include "streaming.h"

GST_DEBUG_CATEGORY(flvdmx_debug);

extern "C" {

struct FlvdmxDemux {
    GstElement element;
    flvdmx_gst::Streaming* streaming;
};

struct FlvdmxDemuxClass {
    GstElementClass element_class;
};

} // extern "C"

static GType flvdmx_demux_get_type();
G_DEFINE_TYPE(FlvdmxDemux, flvdmx_demux, GST_TYPE_ELEMENT)
GST_ELEMENT_REGISTER_DEFINE(flvdmxdemux, "flvdmxdemux", GST_RANK_SECONDARY, flvdmx_demux_get_type())

static GstStaticPadTemplate sink_template =
    GST_STATIC_PAD_TEMPLATE("sink", GST_PAD_SINK, GST_PAD_ALWAYS, GST_STATIC_CAPS("video/x-flv"));

static flvdmx_gst::Streaming& streaming_of(gpointer element)
{
    return *static_cast<FlvdmxDemux*>(element)->streaming;
}

static gboolean refuse_push(gpointer element)
{
    GST_ELEMENT_ERROR(element, STREAM, DEMUX, (nullptr),
                      ("flvdmxdemux reads at any position: it needs a seekable source that supports pull mode, such as "
                       "filesrc or a download buffer"));
    return FALSE;
}

static bool can_pull(GstPad* sink)
{
    GstQuery* const query = gst_query_new_scheduling();
    const bool pulls =
        gst_pad_peer_query(sink, query) != FALSE &&
        gst_query_has_scheduling_mode_with_flags(query, GST_PAD_MODE_PULL, GST_SCHEDULING_FLAG_SEEKABLE) != FALSE;
    gst_query_unref(query);
    return pulls;
}

static gboolean activate_sink(GstPad* sink, GstObject*)
{
    return gst_pad_activate_mode(sink, can_pull(sink) ? GST_PAD_MODE_PULL : GST_PAD_MODE_PUSH, TRUE);
}

// An element that is not linked yet starts in push mode, which fails as soon as data arrives.
static gboolean activate_sink_mode(GstPad* sink, GstObject* element, GstPadMode mode, gboolean active)
{
    if (mode == GST_PAD_MODE_PULL)
        return streaming_of(element).activate(active != FALSE) ? TRUE : FALSE;
    return active != FALSE && gst_pad_is_linked(sink) != FALSE ? refuse_push(element) : TRUE;
}

static GstFlowReturn refuse_buffer(GstPad*, GstObject* element, GstBuffer* buffer)
{
    gst_buffer_unref(buffer);
    refuse_push(element);
    return GST_FLOW_ERROR;
}

static GstStateChangeReturn change_state(GstElement* element, GstStateChange change)
{
    const GstStateChangeReturn changed = GST_ELEMENT_CLASS(flvdmx_demux_parent_class)->change_state(element, change);
    if (change == GST_STATE_CHANGE_PAUSED_TO_READY)
        streaming_of(element).close();
    return changed;
}

static void flvdmx_demux_init(FlvdmxDemux* self)
{
    GstPad* const sink = gst_pad_new_from_static_template(&sink_template, "sink");
    gst_pad_set_activate_function(sink, activate_sink);
    gst_pad_set_activatemode_function(sink, activate_sink_mode);
    gst_pad_set_chain_function(sink, refuse_buffer);
    gst_element_add_pad(&self->element, sink);
    self->streaming = new flvdmx_gst::Streaming(&self->element, sink);
}

static void finalize(GObject* object)
{
    delete &streaming_of(object);
    G_OBJECT_CLASS(flvdmx_demux_parent_class)->finalize(object);
}

static void add_template(GstElementClass* element_class, const char* name, GstCaps* caps)
{
    gst_element_class_add_pad_template(element_class, gst_pad_template_new(name, GST_PAD_SRC, GST_PAD_SOMETIMES, caps));
    gst_caps_unref(caps);
}

static void flvdmx_demux_class_init(FlvdmxDemuxClass* klass)
{
    GST_DEBUG_CATEGORY_INIT(flvdmx_debug, "flvdmxdemux", 0, "FLV demultiplexer");
    G_OBJECT_CLASS(klass)->finalize = finalize;
    GstElementClass* const element_class = GST_ELEMENT_CLASS(klass);
    element_class->change_state = change_state;
    gst_element_class_add_static_pad_template(element_class, &sink_template);
    add_template(element_class, "video", flvdmx_gst::video_template_caps());
    add_template(element_class, "audio", flvdmx_gst::audio_template_caps());
    gst_element_class_set_static_metadata(element_class, "FLV demultiplexer", "Codec/Demuxer",
                                          "Plays FLV files, even damaged ones", "the flvdmx authors");
}
