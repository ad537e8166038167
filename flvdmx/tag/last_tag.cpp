// Finds the end of the last tag: searches backward from the end of the file and, if other bytes follow the last tag,
// bisects the file.
//
// The search backward handles a few stray bytes and a tag that is cut short. Bisection handles preallocated files,
// whose end may be gigabytes of zeros: it assumes that valid data ends once, with tags before that position and none
// after it.

#include "flvdmx/tag/tag.h"

namespace {

// Positions before the end of the file that are searched for a back-pointer without bisecting first; after it,
// FLVD_SCAN_CURSORS.
constexpr uint32_t FLVD_TAIL_CURSORS_QUICK = 16;
constexpr uint32_t FLVD_TAIL_CURSORS = 256;
constexpr uint32_t FLVD_SCAN_CURSORS = FLVD_RESYNC_WINDOW;
constexpr int64_t FLVD_BISECTION_END = FLVD_RESYNC_WINDOW;

// Results in addition to a position and FLVD_NO_LAST_TAG.
constexpr int64_t FLVD_NO_POSITION = -1;
constexpr int64_t FLVD_NO_SEEK = -2; // internal: a seek failed, which ends the search without a tag

enum class FlvdProbe { Found, Nothing, SeekFailed };

// Checks whether the four bytes at the cursor, where the reader stands, are a back-pointer that leads to a header with
// a matching size. The tag's type is not checked.
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
    const uint32_t data_size = FLVD_GetBE24(bytes + FLVD_DATA_SIZE_OFFSET);
    const bool agrees = data_size + FLVD_TAG_HEADER_SIZE == static_cast<uint32_t>(back);
    return agrees && FLVD_TagTimestamp(bytes) <= max_timestamp ? FlvdProbe::Found : FlvdProbe::Nothing;
}

// Probes `cursors` positions, from `cursor` downwards. Returns the end of the tag found, FLVD_NO_LAST_TAG or
// FLVD_NO_SEEK.
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

// Seeks, then probes `cursors` positions from there downwards. Results as above, or FLVD_NO_POSITION.
int64_t FLVD_ProbeFrom(const flvd_ctx_t* ctx, int64_t offset, int32_t whence, uint32_t cursors)
{
    if (__FLV_DMX__fioSeek64(ctx->cur_reader, offset, whence) != 0)
        return FLVD_NO_SEEK;
    const int64_t cursor = FLVD_FioTell(ctx->cur_reader);
    return cursor < 0 ? FLVD_NO_POSITION : FLVD_ProbeCursors(ctx, cursor, cursors);
}

// Bisects the file until the end of its valid data is in the last MiB before the result. FLVD_NO_SEEK on failure.
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
