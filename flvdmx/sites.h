// Places where a failure is recorded: a code and a line, a number fixed for all releases. Places that variants of one
// algorithm have in common, each at lines of its own, stand in tables beside that algorithm (frame.cpp, frame_seek.cpp,
// time_seek.cpp); all others are here, in the order in which a host meets the operations.
#ifndef FLVDMX_SITES_H
#define FLVDMX_SITES_H

#include "flvdmx/flvdmx.h"

struct flvd_site_t {
    int32_t code;
    int32_t line;
};

constexpr flvd_site_t FLVD_SITE_NONE = {FLVD_ERR_NONE, 0};

// For functions that return where they failed, or FLVD_SITE_NONE.
constexpr bool FLVD_IsFailure(flvd_site_t site)
{
    return site.line != 0;
}

inline void FLVD_Record(flvd_ctx_t* ctx, flvd_site_t site)
{
    ctx->error = site.code;
    ctx->error_line = site.line;
}

// Records and returns the general failure.
inline int32_t FLVD_Fail(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return -1;
}

// Records data cut short and returns it as a place in the file.
inline int32_t FLVD_FailShort(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return FLVD_ERR_END_OF_DATA;
}

// Calls without an instance, and the reserved operation.
constexpr flvd_site_t FLVD_SITE_NO_INSTANCE = {FLVD_ERR_NO_INSTANCE, 2273};
constexpr flvd_site_t FLVD_SITE_RESERVED_OP = {FLVD_ERR_RESERVED_OP, 3420};

// Opening; recorded in the globals.
constexpr flvd_site_t FLVD_SITE_OPEN_INSTANCE = {FLVD_ERR_INSTANCE_MEMORY, 2335};
constexpr flvd_site_t FLVD_SITE_OPEN_MAIN = {FLVD_ERR_OPEN_MAIN, 2386};
constexpr flvd_site_t FLVD_SITE_OPEN_AUDIO = {FLVD_ERR_OPEN_AUDIO, 2396};
constexpr flvd_site_t FLVD_SITE_OPEN_BUFFER = {FLVD_ERR_FRAME_BUFFER, 2413};
constexpr flvd_site_t FLVD_SITE_OPEN_HEADER = {FLVD_ERR_FILE_HEADER, 2423};
constexpr flvd_site_t FLVD_SITE_PROBE_GROWING = {FLVD_ERR_NO_STREAM, 2434};
constexpr flvd_site_t FLVD_SITE_PROBE_GROWING_SHORT = {FLVD_ERR_SHORT_DATA, 2440};
constexpr flvd_site_t FLVD_SITE_PROBE_COMPLETE = {FLVD_ERR_NO_STREAM, 2458};
constexpr flvd_site_t FLVD_SITE_PROBE_EXTENT = {FLVD_ERR_EXTENT, 2465};
constexpr flvd_site_t FLVD_SITE_OPEN_REWIND = {FLVD_ERR_SEEK, 2496};

// Codec probes.
constexpr flvd_site_t FLVD_SITE_AUDIO_TAG = {FLVD_ERR_SHORT_DATA, 659};
constexpr flvd_site_t FLVD_SITE_MP3_DATA = {FLVD_ERR_SHORT_DATA, 694};
constexpr flvd_site_t FLVD_SITE_MP3_HEADER = {FLVD_ERR_AUDIO_HEADER, 700};
constexpr flvd_site_t FLVD_SITE_AAC_DATA = {FLVD_ERR_SHORT_DATA, 741};
constexpr flvd_site_t FLVD_SITE_AAC_MEMORY = {FLVD_ERR_NO_MEMORY, 752};
constexpr flvd_site_t FLVD_SITE_MP3_8KHZ_DATA = {FLVD_ERR_SHORT_DATA, 781};
constexpr flvd_site_t FLVD_SITE_MP3_8KHZ_HEADER = {FLVD_ERR_AUDIO_HEADER, 787};
constexpr flvd_site_t FLVD_SITE_VIDEO_TAG = {FLVD_ERR_SHORT_DATA, 818};
constexpr flvd_site_t FLVD_SITE_H263_DATA = {FLVD_ERR_SHORT_DATA, 841};
constexpr flvd_site_t FLVD_SITE_H263_HEADER = {FLVD_ERR_VIDEO_HEADER, 847};
constexpr flvd_site_t FLVD_SITE_VP6_DATA = {FLVD_ERR_SHORT_DATA, 863};
constexpr flvd_site_t FLVD_SITE_VP6_HEADER = {FLVD_ERR_VIDEO_HEADER, 869};
constexpr flvd_site_t FLVD_SITE_VP6A_DATA = {FLVD_ERR_SHORT_DATA, 881};
constexpr flvd_site_t FLVD_SITE_VP6A_HEADER = {FLVD_ERR_VIDEO_HEADER, 887};
constexpr flvd_site_t FLVD_SITE_AVC_DATA = {FLVD_ERR_SHORT_DATA, 913};
constexpr flvd_site_t FLVD_SITE_AVC_MEMORY = {FLVD_ERR_NO_MEMORY, 924};
constexpr flvd_site_t FLVD_SITE_AVC_CONFIG = {FLVD_ERR_AVC_CONFIG, 932};
constexpr flvd_site_t FLVD_SITE_AVC_PARAMETERS = {FLVD_ERR_VIDEO_HEADER, 938};
constexpr flvd_site_t FLVD_SITE_AVC_NO_SEQ_HEADER = {FLVD_ERR_AVC_NO_SEQ_HEADER, 946};

// Extent probing.
constexpr flvd_site_t FLVD_SITE_QUICK_LAST_TAG = {FLVD_ERR_POSITION, 226};
constexpr flvd_site_t FLVD_SITE_QUICK_WALK_SEEK = {FLVD_ERR_SEEK, 241};
constexpr flvd_site_t FLVD_SITE_QUICK_WALK_STEP = {FLVD_ERR_NO_TAG, 248};
constexpr flvd_site_t FLVD_SITE_INDEX_FILE_SEEK = {FLVD_ERR_SEEK, 308};
constexpr flvd_site_t FLVD_SITE_INDEX_MEMORY_SEEK = {FLVD_ERR_SEEK, 338};
constexpr flvd_site_t FLVD_SITE_INDEX_FORWARD_POSITION = {FLVD_ERR_POSITION, 347};
constexpr flvd_site_t FLVD_SITE_INDEX_BACK_SEEK = {FLVD_ERR_SEEK, 357};
constexpr flvd_site_t FLVD_SITE_INDEX_BACK_POSITION = {FLVD_ERR_POSITION, 364};
constexpr flvd_site_t FLVD_SITE_INDEX_LAST_TAG = {FLVD_ERR_POSITION, 375};
constexpr flvd_site_t FLVD_SITE_TRIM_POSITIONS_SEEK = {FLVD_ERR_SEEK, 405};
constexpr flvd_site_t FLVD_SITE_TRIM_TIMES_SEEK = {FLVD_ERR_SEEK, 449};
constexpr flvd_site_t FLVD_SITE_LAST_TAG = {FLVD_ERR_POSITION, 479};
constexpr flvd_site_t FLVD_SITE_NO_TAG = {FLVD_ERR_NO_TAG, 486};
constexpr flvd_site_t FLVD_SITE_WALK_SEEK = {FLVD_ERR_SEEK, 503};
constexpr flvd_site_t FLVD_SITE_WALK_STEP = {FLVD_ERR_NO_TAG, 510};

// Frame delivery of a growing file: places that a complete file does not have.
constexpr flvd_site_t FLVD_SITE_FRAME_RESUME = {FLVD_ERR_SEEK, 2830};
constexpr flvd_site_t FLVD_SITE_FRAME_POSITION = {FLVD_ERR_POSITION, 2840};
constexpr flvd_site_t FLVD_SITE_ROLLBACK_END = {FLVD_ERR_SEEK, 2933};
constexpr flvd_site_t FLVD_SITE_ROLLBACK_SKIP = {FLVD_ERR_SEEK, 2945};

// Time seek of a growing file: the audio reader follows the main reader.
constexpr flvd_site_t FLVD_SITE_SEEK_FOLLOW_POSITION = {FLVD_ERR_POSITION, 3295};
constexpr flvd_site_t FLVD_SITE_SEEK_FOLLOW = {FLVD_ERR_SEEK, 3299};

// Frame seek.
constexpr flvd_site_t FLVD_SITE_AUDIO_FOLLOW_POSITION = {FLVD_ERR_POSITION, 134};
constexpr flvd_site_t FLVD_SITE_AUDIO_FOLLOW_SEEK = {FLVD_ERR_SEEK, 140};
constexpr flvd_site_t FLVD_SITE_AUDIO_FIRST_STEP = {FLVD_ERR_SEEK_PLACE, 171};
constexpr flvd_site_t FLVD_SITE_AUDIO_WALK = {FLVD_ERR_SEEK_PLACE, 231};
constexpr flvd_site_t FLVD_SITE_VIDEO_ESTIMATE = {FLVD_ERR_SEEK, 747};
constexpr flvd_site_t FLVD_SITE_VIDEO_FIRST_STEP = {FLVD_ERR_SEEK_PLACE, 778};
constexpr flvd_site_t FLVD_SITE_VIDEO_WALK = {FLVD_ERR_SEEK_PLACE, 817};
constexpr flvd_site_t FLVD_SITE_SEEK_METHOD = {FLVD_ERR_NOT_SEEKABLE, 844};
constexpr flvd_site_t FLVD_SITE_INDEX_TIMES_SEEK = {FLVD_ERR_SEEK, 263};
constexpr flvd_site_t FLVD_SITE_INDEX_POSITIONS_SEEK = {FLVD_ERR_SEEK, 316};
constexpr flvd_site_t FLVD_SITE_INDEX_POSITION_TYPE = {FLVD_ERR_INDEX_ELEMENT, 325};

#endif
