// The careful search of a frame request, between the files that find its tags.
#ifndef FLVDMX_TAG_SEARCH_H
#define FLVDMX_TAG_SEARCH_H

#include "flvdmx/tag/tag.h"

// True when a wanted tag is delivered before its back-pointer is checked. A frame that does not fit the buffer is
// checked first, so that no false header makes the buffer grow, and so is every tag once a check has failed: a request
// reads one payload in vain at most.
inline bool FLVD_IsReadBeforeCheck(const flvd_frame_search_t& search, const flvd_found_tag_t& tag)
{
    return tag.data_size + FLVD_TAG_OVERHEAD > search.file->capacity && tag.codec_header != 0 &&
           tag.data_size - tag.codec_header <= search.ctx->frame_buffer_size &&
           search.checks_left == FLVD_FAILED_CHECKS_MAX;
}

// The search of FLVD_FindFrameTag from a position that was taken.
int32_t FLVD_SearchFrameTag(flvd_frame_search_t* search, int64_t position, flvd_found_tag_t* tag);

#endif
