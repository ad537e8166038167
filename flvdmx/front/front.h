// Front end: what the entry point is made of.
//
// Files: entry.cpp dispatches and translates results, open.cpp opens and releases an instance, probe.cpp finds its
// streams, frame.cpp delivers frames, bits.cpp is the bit reader of the file header, layout.cpp asserts the records.
#ifndef FLVDMX_FRONT_FRONT_H
#define FLVDMX_FRONT_FRONT_H

#include "flvdmx/common/sites.h"
#include "flvdmx/flvdmx.h"

// Opens the file that the initialisation block names and probes it. Null on failure, which is recorded in the globals;
// nothing stays allocated or open then.
flvd_ctx_t* FLVD_OpenInstance(const flvd_init_t* init, flvd_open_info_t* info, bool for_info);

// Closes and releases everything that an instance has so far, opened fully or not.
void FLVD_ReleaseInstance(flvd_ctx_t* ctx);

// Finds the file header and takes streams, data offset and file size from it. False when it cannot be right.
bool FLVD_ReadFileHeader(flvd_ctx_t* ctx);

// Second half of opening: finds the streams, their configuration, metadata and the file's extent, fills the host's
// records and puts the readers on the first tag. Returns where it failed.
flvd_site_t FLVD_ProbeStreams(flvd_ctx_t* ctx, flvd_open_info_t* info);

// Delivers the next frame. 0, or -1 with error and error_line set.
int32_t FLVD_GetFrame(flvd_ctx_t* ctx, const flvd_frame_request_t* request, flvd_frame_t* frame);

// Most tags that one request, or the probing of one file, handles.
constexpr uint32_t FLVD_TAG_BUDGET = 102;

#endif
