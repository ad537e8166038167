// Front end: the operations of the entry point.
//
// Files: entry.cpp dispatches and translates results, open.cpp opens and releases an instance, probe.cpp finds its
// streams, frame.cpp delivers frames, bits.cpp is the bit reader, layout.cpp asserts the layout of the records.
#ifndef FLVDMX_FRONT_FRONT_H
#define FLVDMX_FRONT_FRONT_H

#include "flvdmx/common/sites.h"
#include "flvdmx/flvdmx.h"

// Opens and probes the file that the initialisation block names. On failure returns null, records the failure in the
// globals and leaves nothing allocated or open.
flvd_ctx_t* FLVD_OpenInstance(const flvd_init_t* init, flvd_open_info_t* info, bool for_info);

// Releases an instance and everything it holds, even if it was only partly opened.
void FLVD_ReleaseInstance(flvd_ctx_t* ctx);

// Finds and parses the file header: sets streams and data offset and, for a complete file, its size. False when there
// is no valid header or the size cannot be determined.
bool FLVD_ReadFileHeader(flvd_ctx_t* ctx);

// Second half of opening: finds the streams, their configuration, the metadata and the end of the valid data, moves the
// readers to the first tag and fills the host's records. Returns the site of a failure, or FLVD_SITE_NONE.
flvd_site_t FLVD_ProbeStreams(flvd_ctx_t* ctx, flvd_open_info_t* info);

// Delivers the next frame. Returns 0, or -1 with error and error_line set.
int32_t FLVD_GetFrame(flvd_ctx_t* ctx, const flvd_frame_request_t* request, flvd_frame_t* frame);

// Upper limit of the tags that one frame request, or the probing of one file, handles.
constexpr uint32_t FLVD_TAG_BUDGET = 102;

#endif
