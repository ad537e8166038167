/*
 * Codec configurations that a file brings after its beginning.
 */
#pragma once

#include "flvdmx/flvdmx.hpp"

namespace flvdmx_gst {

/** Describes the stream by another configuration. False when that is damaged, and the description stays as it was.
 *  Takes the lock for opens. */
bool set_config(flvdmx::VideoInfo& info, flvdmx::Bytes config);
bool set_config(flvdmx::AudioInfo& info, flvdmx::Bytes config);

} // namespace flvdmx_gst
