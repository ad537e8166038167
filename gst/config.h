/*
 * Codec configurations that follow the first frames of a file.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

namespace flvdmx_gst {

/** Updates the description of the stream for another configuration. Returns false and changes nothing if that is
 *  damaged. Takes the lock for opens. */
bool set_config(flvdmx::VideoInfo& info, flvdmx::Bytes config);
bool set_config(flvdmx::AudioInfo& info, flvdmx::Bytes config);

} // namespace flvdmx_gst
