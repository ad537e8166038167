// Seeking: the time seek of operation 3, and the frame seeks with which it moves the readers to a tag.
//
// Files: time_seek.cpp chooses the target and restores the readers after a failure, frame_seek.cpp seeks by the
// keyframe index, scan_seek.cpp by walking from tag to tag.
#ifndef FLVDMX_SEEK_SEEK_H
#define FLVDMX_SEEK_SEEK_H

#include "flvdmx/flvdmx.h"

// Direction of a frame seek. Any value but FLVD_DIRECTION_BACKWARD means forward.
constexpr uint32_t FLVD_DIRECTION_BACKWARD = 1;
constexpr uint32_t FLVD_DIRECTION_FORWARD = 0;

// Time seek of operation 3, for complete and for growing files. Return 0, or -1 with error and error_line set; `result`
// is written on success only.
int32_t FLVD_RunTimeSeek(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode);
int32_t FLVD_RunTimeSeekProgressive(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode);

// Frame seeks by scanning; results as for FLVD_RunFrameSeek. Video moves the main reader, audio the audio reader. A
// separate audio reader follows the main reader if the file has video.
int32_t FLVD_RunVideoScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction);
int32_t FLVD_RunAudioScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction);

constexpr uint32_t FLVD_TimeDistance(uint32_t a, uint32_t b)
{
    return a > b ? a - b : b - a;
}

#endif
