// Codec configuration: describes each stream from its first tag.
//
// Files: audio.cpp (codec byte, AudioSpecificConfig, MPEG frame header), video.cpp (codec byte, H.263 and VP6 picture
// headers), avc.cpp (AVC record and sequence parameter set), config.cpp (the instance's copy of a configuration).
#ifndef FLVDMX_CODEC_CODEC_H
#define FLVDMX_CODEC_CODEC_H

#include "flvdmx/flvdmx.h"

// Describe a stream from the tag at the current reader's position, without consuming anything. After a failure the
// caller may try the stream's next tag. Return 0; FLVD_ERR_END_OF_DATA when the tag is cut short; -1 on any other
// failure. Both failures set error and error_line.
int32_t FLVD_ProbeAudioTag(flvd_ctx_t* ctx);
int32_t FLVD_ProbeVideoTag(flvd_ctx_t* ctx);

// Replaces a stream's copy of its codec configuration by the `size` bytes at `source` without the first `header` bytes.
// False, with no copy left, when there are fewer than `header` bytes or no memory.
bool FLVD_ReplaceConfig(uint8_t** config, uint32_t* config_size, const uint8_t* source, uint32_t size, uint32_t header);

// Reads the displayed picture size from the first sequence parameter set (ISO/IEC 14496-10) among NAL units with start
// codes. -1 when there is none or it is invalid.
int32_t FLVD_ParseH264SPS(flvd_video_info_t* info, const uint8_t* data, int32_t length);

#endif
