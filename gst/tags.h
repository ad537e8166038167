/*
 * The metadata of an FLV file as GStreamer tags.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <gst/gst.h>

namespace flvdmx_gst {

/** Title, creator and so on, and the name of the container: for all streams. Owned by the caller. */
GstTagList* make_file_tags(const flvdmx::Metadata& metadata);

/** Codec and bit rate of a stream with these caps. Owned by the caller. */
GstTagList* make_stream_tags(const flvdmx::Metadata& metadata, flvdmx::Stream stream, const GstCaps* caps);

} // namespace flvdmx_gst
