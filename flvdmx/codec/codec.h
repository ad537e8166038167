// Codec configuration: what the first tag of each stream tells about it.
//
// Files: audio.cpp (tag byte, AudioSpecificConfig, MPEG frame header), video.cpp (tag byte, H.263 and VP6 pictures),
// avc.cpp (AVC record and sequence parameter set), config.cpp (the copy of a configuration).
#ifndef FLVDMX_CODEC_CODEC_H
#define FLVDMX_CODEC_CODEC_H

#include "flvdmx/flvdmx.h"

// Describe the stream whose first tag the current reader stands on. They peek only. They may run again on another tag
// when one failed. 0; FLVD_ERR_END_OF_DATA when the tag is cut short; -1 on any other failure, error and error_line
// being set in both cases.
int32_t FLVD_ProbeAudioTag(flvd_ctx_t* ctx);
int32_t FLVD_ProbeVideoTag(flvd_ctx_t* ctx);

// Replaces a stream's copy of its codec configuration by `size` bytes of `source`, of which `header` bytes come before
// the configuration itself. False, with no copy left, when the bytes cannot hold one or there is no memory.
bool FLVD_ReplaceConfig(uint8_t** config, uint32_t* config_size, const uint8_t* source, uint32_t size, uint32_t header);

// Reads the displayed picture size from the first sequence parameter set (ISO/IEC 14496-10) among start-code prefixed
// NAL units. -1 when there is none or it is not understood.
int32_t FLVD_ParseH264SPS(flvd_video_info_t* info, const uint8_t* data, int32_t length);

#endif
