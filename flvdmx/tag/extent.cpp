// Finds the end of the valid data and the last timestamp. The file size is no substitute for that end: other bytes may
// follow the last tag, and a download may have been cut off inside one.
//
// Everything found here bounds what counts as a plausible header from then on: no tag is larger than the valid data,
// and none is later than the last timestamp. That is what makes false headers rare in damaged files.

#include "flvdmx/tag/tag.h"

#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/keyframe_index.h"

#include <algorithm>

namespace {

// Enough to find both streams in interleaved files without reading far into one that has a long stretch of one stream
// at its end.
constexpr uint32_t FLVD_WALK_TAGS = 10;

// End of the tag at the position, its PreviousTagSize included; negative when the tell fails.
int64_t FLVD_TagEnd(fio_file_t* file, const flvd_tag_info_t& tag)
{
    const int64_t start = FLVD_FioTell(file);
    return start < 0 ? start : start + tag.data_size + FLVD_TAG_OVERHEAD;
}

// Walks forward to the end of the last tag, starting with `tag`, where the reader stands.
int32_t FLVD_WalkToEnd(flvd_ctx_t* ctx, flvd_tag_info_t tag, int64_t* end)
{
    do {
        *end = FLVD_TagEnd(ctx->cur_reader, tag);
        if (*end < 0)
            return FLVD_Fail(ctx, FLVD_SITE_INDEX_FORWARD_POSITION);
    } while (FLVD_MoveToNextTag(ctx, ctx->cur_reader, &tag, FLVD_TAG_ANY, nullptr) == 0);
    return 0;
}

int32_t FLVD_LastTagEnd(flvd_ctx_t* ctx, flvd_site_t site, int64_t* end)
{
    *end = FLVD_FindLastTagEnd(ctx, false);
    return *end < 0 ? FLVD_Fail(ctx, site) : 0;
}

// Fallback when no tag is found at or after the last keyframe position inside the file: finds the end of the nearest
// tag before that position.
int32_t FLVD_StepBackToEnd(flvd_ctx_t* ctx, int64_t last, int64_t* end)
{
    fio_file_t* const file = ctx->cur_reader;
    if (__FLV_DMX__fioSeek64(file, last, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_INDEX_BACK_SEEK);
    const FLVD_ReadSizeGuard narrow(file, FLVD_NARROW_READ, FLVD_WHOLE_CACHE);
    flvd_tag_info_t tag;
    if (FLVD_MoveToPrevTag(ctx, file, &tag, FLVD_TAG_ANY, nullptr) != 0)
        return FLVD_LastTagEnd(ctx, FLVD_SITE_INDEX_LAST_TAG, end);
    *end = FLVD_TagEnd(file, tag);
    return *end < 0 ? FLVD_Fail(ctx, FLVD_SITE_INDEX_BACK_POSITION) : 0;
}

// Finds the end of the valid data of a file with a keyframe index.
int32_t FLVD_IndexedEnd(flvd_ctx_t* ctx, int64_t* end)
{
    fio_file_t* const file = ctx->cur_reader;
    int64_t last = 0;
    bool all_inside = false;
    if (FLVD_FindLastInside(ctx, &last, &all_inside) != 0)
        return -1;
    if (all_inside)
        return FLVD_LastTagEnd(ctx, FLVD_SITE_INDEX_LAST_TAG, end);
    // The file is shorter than its index says.
    if (__FLV_DMX__fioSeek64(file, last, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_IsIndexInMemory(ctx) ? FLVD_SITE_INDEX_MEMORY_SEEK : FLVD_SITE_INDEX_FILE_SEEK);
    flvd_tag_info_t tag;
    const bool found = FLVD_GetCurrTagInfo(ctx, file, &tag, FLVD_TAG_ANY, 1) == 0;
    return found ? FLVD_WalkToEnd(ctx, tag, end) : FLVD_StepBackToEnd(ctx, last, end);
}

// Walks back over at most FLVD_WALK_TAGS tags, until every stream has been seen, and stores the largest timestamp: the
// last tag of one stream may be earlier than that of the other.
int32_t FLVD_WalkBack(flvd_ctx_t* ctx, int64_t end, flvd_site_t seek_site, flvd_site_t step_site)
{
    fio_file_t* const file = ctx->main_reader;
    if (__FLV_DMX__fioSeek64(file, end, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, seek_site);
    const FLVD_ReadSizeGuard narrow(file, FLVD_NARROW_READ, FLVD_WHOLE_CACHE);
    uint32_t largest = 0;
    uint32_t met = 0;
    for (uint32_t taken = 0; taken < FLVD_WALK_TAGS && (met & ctx->streams) != ctx->streams; ++taken) {
        flvd_tag_info_t tag;
        if (FLVD_MoveToPrevTag(ctx, file, &tag, FLVD_TAG_MEDIA, nullptr) != 0)
            return FLVD_Fail(ctx, step_site);
        met |= tag.type == FLVD_TAG_TYPE_VIDEO ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
        largest = std::max(largest, tag.timestamp);
    }
    ctx->last_ts = largest;
    ctx->data_end = end;
    return 0;
}

// For an open that only wants information: a file whose last bytes are no tag is not searched, and then has no
// duration.
int32_t FLVD_ProbeExtentQuick(flvd_ctx_t* ctx)
{
    const int64_t end = FLVD_FindLastTagEnd(ctx, true);
    if (end < 0)
        return FLVD_Fail(ctx, FLVD_SITE_QUICK_LAST_TAG);
    if (end == FLVD_NO_LAST_TAG) {
        ctx->data_end = ctx->file_size;
        return 0;
    }
    return FLVD_WalkBack(ctx, end, FLVD_SITE_QUICK_WALK_SEEK, FLVD_SITE_QUICK_WALK_STEP);
}

// Finds the end of the valid data, sets the seek method and trims the index to that end.
int32_t FLVD_FindEnd(flvd_ctx_t* ctx, int64_t* end)
{
    if (!FLVD_IsIndexUsable(ctx)) {
        // A single entry says that the file has one keyframe: there is nothing to seek to.
        ctx->seek_method = ctx->keyframe_index.entry_count == 1 ? FLVD_SEEK_NONE : FLVD_SEEK_BY_SCAN;
        return FLVD_LastTagEnd(ctx, FLVD_SITE_LAST_TAG, end);
    }
    ctx->seek_method = FLVD_SEEK_BY_INDEX;
    const int32_t result = FLVD_IndexedEnd(ctx, end);
    return result != 0 ? result : FLVD_TrimIndex(ctx, *end);
}

} // namespace

int32_t FLVD_ProbeExtent(flvd_ctx_t* ctx, bool quick)
{
    if (quick)
        return FLVD_ProbeExtentQuick(ctx);
    int64_t end = 0;
    if (FLVD_FindEnd(ctx, &end) != 0)
        return -1;
    if (end == FLVD_NO_LAST_TAG)
        return FLVD_Fail(ctx, FLVD_SITE_NO_TAG);
    return FLVD_WalkBack(ctx, end, FLVD_SITE_WALK_SEEK, FLVD_SITE_WALK_STEP);
}
