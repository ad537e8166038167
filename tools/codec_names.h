// Names of the codecs that FLV knows.
#ifndef FLVDMX_TOOLS_CODEC_NAMES_H
#define FLVDMX_TOOLS_CODEC_NAMES_H

#include <cstdint>
#include <string>

#include "flvdmx/flvdmx.h"

namespace tool {

uint32_t VideoCodecId(const flvd_ctx_t& instance);     /**< CodecID; the instance has video */
uint32_t AudioSoundFormat(const flvd_ctx_t& instance); /**< SoundFormat; the instance has audio */

std::string VideoCodec(const flvd_ctx_t& instance);
std::string AudioCodec(const flvd_ctx_t& instance);

} // namespace tool

#endif
