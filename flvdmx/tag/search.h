// The careful search of a frame request: what frame_tag.cpp and forward.cpp share.
#ifndef FLVDMX_TAG_SEARCH_H
#define FLVDMX_TAG_SEARCH_H

#include "flvdmx/tag/tag.h"

// True when a wanted tag may be delivered before its back-pointer is checked: it is larger than the cache, so checking
// first would mean seeking past it and back. Two exceptions are checked first: a frame that does not fit the buffer, so
// that no false header makes the buffer grow, and every tag once a check has failed, so that a request reads at most
// one payload for nothing.
inline bool FLVD_IsReadBeforeCheck(const flvd_frame_search_t& search, const flvd_found_tag_t& tag)
{
    return tag.data_size + FLVD_TAG_OVERHEAD > search.file->capacity && tag.codec_header != 0 &&
           tag.data_size - tag.codec_header <= search.ctx->frame_buffer_size &&
           search.checks_left == FLVD_FAILED_CHECKS_MAX;
}

// The slow path of FLVD_FindFrameTag. `position` is the reader's position.
int32_t FLVD_SearchFrameTag(flvd_frame_search_t* search, int64_t position, flvd_found_tag_t* tag);

#endif
