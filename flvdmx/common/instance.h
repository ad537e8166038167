// Queries on an instance that several layers make. Options never change after the open; the streams are those that the
// file header announces until probing has found the real ones.
#ifndef FLVDMX_COMMON_INSTANCE_H
#define FLVDMX_COMMON_INSTANCE_H

#include "flvdmx/flvdmx.h"

inline bool FLVD_IsGrowing(const flvd_ctx_t* ctx)
{
    return (ctx->options & FLVD_OPT_PROGRESSIVE) != 0;
}

inline bool FLVD_HasUserBuffer(const flvd_ctx_t* ctx)
{
    return (ctx->options & FLVD_OPT_USER_BUFFER) != 0;
}

// True when audio has a separate reader. Otherwise audio_reader and main_reader are the same reader.
inline bool FLVD_HasAudioReader(const flvd_ctx_t* ctx)
{
    return ctx->opened_for_info == 0 && (ctx->options & FLVD_OPT_SEPARATE_AUDIO_READER) != 0;
}

inline bool FLVD_HasVideo(const flvd_ctx_t* ctx)
{
    return (ctx->streams & FLVD_STREAM_VIDEO) != 0;
}

inline bool FLVD_HasAudio(const flvd_ctx_t* ctx)
{
    return (ctx->streams & FLVD_STREAM_AUDIO) != 0;
}

#endif
