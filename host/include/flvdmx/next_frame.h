/*
 * The next frame, however many tags lie before it: what a program calls to play a file.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_NEXT_FRAME_H
#define FLVDMX_NEXT_FRAME_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Asks for a frame with FLVD_OP_GET_FRAME. One such request gives up after 102 tags without a frame; this function
 * retries while the reader advances inside the data, so it crosses damaged stretches of any length.
 *
 * @param instance open instance; null as for QVX_FLV_DMX
 * @param request  as for QVX_FLV_DMX: it names the stream with a separate audio reader and brings the caller's buffer
 * @param frame    written on success; `data` is valid until the next request on the instance
 * @return as QVX_FLV_DMX. FLVD_RET_END of a complete file is final; of a growing file it means that there is no more so
 *         far: ask again after a while, and once more after the file has stopped growing.
 * @note   Ends for every file: each retry starts after the one before.
 */
int32_t flvd_next_frame(flvd_ctx_t* instance, const flvd_frame_request_t* request, flvd_frame_t* frame);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_NEXT_FRAME_H */
