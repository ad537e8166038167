// How far the valid data reaches and which timestamp its last tags carry. The file size is not taken as the end of
// the tag chain: bytes that belong to no tag may follow the last one, and a download may have been cut short.

#include "flvdmx/tag/tag.h"

#include "flvdmx/common/bytes.h"
#include "flvdmx/common/instance.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/keyframe_index.h"

#include <algorithm>

namespace {

constexpr uint32_t FLVD_TAIL_CURSORS_QUICK = 16;
constexpr uint32_t FLVD_TAIL_CURSORS = 256;
constexpr uint32_t FLVD_SCAN_CURSORS = FLVD_RESYNC_WINDOW;
constexpr int64_t FLVD_BISECTION_END = FLVD_RESYNC_WINDOW;
constexpr uint32_t FLVD_WALK_TAGS = 10;

// Results of the last-tag search beside a position.
constexpr int64_t FLVD_NO_LAST_TAG = 0;
constexpr int64_t FLVD_NO_POSITION = -1;
constexpr int64_t FLVD_NO_SEEK = -2; // inside the search: ends it without a tag

enum class FlvdProbe { Found, Nothing, SeekFailed };

// Back-pointer probe: do the four bytes at the cursor, where the reader stands, lead back to a header of that size?
// The tag's type is not asked.
FlvdProbe FLVD_ProbeBackPointer(fio_file_t* file, uint32_t max_timestamp, int64_t cursor)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return FlvdProbe::Nothing;
    const auto back = static_cast<int32_t>(FLVD_GetBE32(bytes));
    if (back <= 0 || back >= cursor)
        return FlvdProbe::Nothing;
    if (__FLV_DMX__fioSeek64(file, -int64_t{back}, FIO_SEEK_CUR) != 0)
        return FlvdProbe::SeekFailed;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_HEADER_SIZE, file) < FLVD_TAG_HEADER_SIZE)
        return FlvdProbe::Nothing;
    const uint32_t data_size = FLVD_GetBE24(bytes + FLVD_DATA_SIZE_FIELD);
    const bool agrees = data_size + FLVD_TAG_HEADER_SIZE == static_cast<uint32_t>(back);
    return agrees && FLVD_TagTimestamp(bytes) <= max_timestamp ? FlvdProbe::Found : FlvdProbe::Nothing;
}

// Tries so many cursors, from `cursor` downwards. The end of the tag found, FLVD_NO_LAST_TAG or FLVD_NO_SEEK.
int64_t FLVD_ProbeCursors(const flvd_ctx_t* ctx, int64_t cursor, uint32_t cursors)
{
    fio_file_t* const file = ctx->cur_reader;
    const uint32_t max_timestamp = FLVD_TagRules(ctx).max_timestamp;
    for (; cursors != 0; --cursors, --cursor) {
        const FlvdProbe probe = FLVD_ProbeBackPointer(file, max_timestamp, cursor);
        if (probe == FlvdProbe::Found)
            return cursor + FLVD_BACK_POINTER_SIZE;
        if (probe == FlvdProbe::SeekFailed || __FLV_DMX__fioSeek64(file, cursor - 1, FIO_SEEK_SET) != 0)
            return FLVD_NO_SEEK;
    }
    return FLVD_NO_LAST_TAG;
}

// Moves by a seek and tries so many cursors from there downwards. Results as above, or FLVD_NO_POSITION.
int64_t FLVD_ProbeFrom(const flvd_ctx_t* ctx, int64_t offset, int32_t whence, uint32_t cursors)
{
    if (__FLV_DMX__fioSeek64(ctx->cur_reader, offset, whence) != 0)
        return FLVD_NO_SEEK;
    const int64_t cursor = FLVD_FioTell(ctx->cur_reader);
    return cursor < 0 ? FLVD_NO_POSITION : FLVD_ProbeCursors(ctx, cursor, cursors);
}

// Halves the file until the end of its valid data lies within the last MiB before the result, or FLVD_NO_SEEK.
int64_t FLVD_Bisect(flvd_ctx_t* ctx)
{
    fio_file_t* const file = ctx->cur_reader;
    int64_t low = 0;
    int64_t high = ctx->file_size;
    while (high - low > FLVD_BISECTION_END) {
        const int64_t probe = low + (high - low) / 2;
        if (__FLV_DMX__fioSeek64(file, probe, FIO_SEEK_SET) != 0)
            return FLVD_NO_SEEK;
        flvd_tag_info_t tag;
        const int32_t distance = FLVD_FindNextTag(ctx, file, FLVD_RESYNC_WINDOW);
        if (distance >= 0 && FLVD_GetCurrTagInfo(ctx, file, &tag, FLVD_TAG_MEDIA, 1) == 0)
            low = probe + distance;
        else
            high = probe;
    }
    return high;
}

// End of the tag at the position, its PreviousTagSize included; negative when the position cannot be told.
int64_t FLVD_TagEnd(fio_file_t* file, const flvd_tag_info_t& tag)
{
    const int64_t start = FLVD_FioTell(file);
    return start < 0 ? start : start + tag.data_size + FLVD_TAG_OVERHEAD;
}

// From this tag, on which the reader stands, walks forward to the end of the last tag.
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

// No tag follows the last keyframe inside the file: the end of the nearest one before it.
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

// The end of the valid data of a file with a keyframe index.
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

// Backward walk: the largest timestamp of the last tags, until each stream was met.
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

// The end of the valid data and the seek method, the index being trimmed to it.
int32_t FLVD_FindEnd(flvd_ctx_t* ctx, int64_t* end)
{
    if (!FLVD_IsIndexUsable(ctx)) {
        ctx->seek_method = ctx->keyframe_index.entry_count == 1 ? FLVD_SEEK_NONE : FLVD_SEEK_BY_SCAN;
        return FLVD_LastTagEnd(ctx, FLVD_SITE_LAST_TAG, end);
    }
    ctx->seek_method = FLVD_SEEK_BY_INDEX;
    const int32_t result = FLVD_IndexedEnd(ctx, end);
    return result != 0 ? result : FLVD_TrimIndex(ctx, *end);
}

} // namespace

int64_t FLVD_FindLastTagEnd(flvd_ctx_t* ctx, bool quick)
{
    const FLVD_ReadSizeGuard narrow(ctx->cur_reader, FLVD_NARROW_READ, FLVD_WHOLE_CACHE);
    const uint32_t tail = quick ? FLVD_TAIL_CURSORS_QUICK : FLVD_TAIL_CURSORS;
    int64_t end = FLVD_ProbeFrom(ctx, -int64_t{FLVD_BACK_POINTER_SIZE}, FIO_SEEK_END, tail);
    if (end == FLVD_NO_LAST_TAG && !quick) {
        const int64_t start = FLVD_Bisect(ctx);
        end = start != FLVD_NO_SEEK ? FLVD_ProbeFrom(ctx, start, FIO_SEEK_SET, FLVD_SCAN_CURSORS) : FLVD_NO_SEEK;
    }
    return end == FLVD_NO_SEEK ? FLVD_NO_LAST_TAG : end;
}

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
