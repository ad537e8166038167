/*
 * The next frame, however many tags come before it: the function to play a file with.
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_NEXT_FRAME_H
#define FLVDMX_NEXT_FRAME_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Gets the next frame with FLVD_OP_GET_FRAME. A single request gives up after 102 tags without a frame; this function
 * retries while the reader advances inside the data, so it crosses damage of any length. After more than 1 MiB without
 * a tag, the first tag or two can be lost.
 *
 * @param instance open instance; null fails as in QVX_FLV_DMX
 * @param request  as for QVX_FLV_DMX: the stream, with a separate audio reader; the caller's buffer, if it has one
 * @param frame    written on success; `data` is valid until the next request on the instance
 * @return as QVX_FLV_DMX. For a complete file FLVD_RET_END is final. For a growing file it means that there is no more
 *         data yet: retry later, and once more after the file has stopped growing.
 * @note   Terminates for every file, because each retry starts after the previous one.
 */
int32_t flvd_next_frame(flvd_ctx_t* instance, const flvd_frame_request_t* request, flvd_frame_t* frame);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_NEXT_FRAME_H */
