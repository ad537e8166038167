// The plugin "flvdmx": one element, flvdmxdemux.

#include "demux.h"

#include <gst/gst.h>

static gboolean register_elements(GstPlugin* plugin)
{
    return GST_ELEMENT_REGISTER(flvdmxdemux, plugin);
}

#define PACKAGE "flvdmx"
GST_PLUGIN_DEFINE(GST_VERSION_MAJOR, GST_VERSION_MINOR, flvdmx, "Demultiplexer for the FLV container",
                  register_elements, FLVDMX_VERSION, "MIT/X11", "flvdmx", "Unknown package origin")
