/*
 * Caps for the streams of an FLV file.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

#include <gst/gst.h>

namespace flvdmx_gst {

/** All caps that a stream can have: those of the pad templates, owned by the caller. */
GstCaps* video_template_caps();
GstCaps* audio_template_caps();

/** The stream's caps, owned by the caller. Null for a codec that no decoder accepts, or if the configuration that
 *  decoders need is missing. */
GstCaps* make_caps(const flvdmx::VideoInfo& info);
GstCaps* make_caps(const flvdmx::AudioInfo& info);

} // namespace flvdmx_gst
