// Seeking: the time seek of operation 3, and the frame seeks by which it puts the readers on a tag.
//
// Files: time_seek.cpp chooses the target and restores the readers after a failure, frame_seek.cpp seeks by the
// keyframe index, scan_seek.cpp by walking from tag to tag.
#ifndef FLVDMX_SEEK_SEEK_H
#define FLVDMX_SEEK_SEEK_H

#include "flvdmx/flvdmx.h"

// Direction of a frame seek; any value but the first is forward.
constexpr uint32_t FLVD_DIRECTION_BACKWARD = 1;
constexpr uint32_t FLVD_DIRECTION_FORWARD = 0;

// Time seek of operation 3, of a complete and of a growing file. `result` is written on success only.
// 0, or -1 with error and error_line set.
int32_t FLVD_RunTimeSeek(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode);
int32_t FLVD_RunTimeSeekProgressive(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode);

// Frame seeks by scanning; results as FLVD_RunFrameSeek. Video on the main reader, audio on the audio reader, after the
// main reader when it has one of its own.
int32_t FLVD_RunVideoScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction);
int32_t FLVD_RunAudioScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction);

constexpr uint32_t FLVD_TimeDistance(uint32_t a, uint32_t b)
{
    return a > b ? a - b : b - a;
}

#endif
