// Frame seek: chooses between the keyframe index and scanning, and seeks by the index, in memory or in the file.
//
// Audio has no index, since any of its tags can be the first one played: it is always found by scanning. `result` is
// a timestamp of the file. Readers are not restored here after a failure; the time seek does that.

#include "flvdmx/seek/seek.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/keyframe_index.h"
#include "flvdmx/tag/tag.h"

namespace {

constexpr uint32_t FLVD_INDEX_TOLERANCE_MS = 1000; // encoders write times that differ from those of the tags

// Failure sites, one set per source of the index.
struct flvd_index_sites_t {
    flvd_site_t rewind;
    flvd_site_t seek;
    flvd_site_t tag_cut;
    flvd_site_t tolerance;
};

constexpr flvd_index_sites_t g_flvd_fileIndexSites = {FLVD_SITE_FILE_INDEX_REWIND, FLVD_SITE_FILE_INDEX_SEEK,
                                                      FLVD_SITE_FILE_INDEX_TAG_CUT, FLVD_SITE_FILE_INDEX_TOLERANCE};
constexpr flvd_index_sites_t g_flvd_memoryIndexSites = {FLVD_SITE_MEMORY_INDEX_REWIND, FLVD_SITE_MEMORY_INDEX_SEEK,
                                                        FLVD_SITE_MEMORY_INDEX_TAG_CUT,
                                                        FLVD_SITE_MEMORY_INDEX_TOLERANCE};

// The target is before the first entry.
int32_t FLVD_RewindByIndex(flvd_ctx_t* ctx, uint32_t* result, flvd_site_t site)
{
    *result = ctx->first_ts;
    return FLVD_SeekToFirstTag(ctx, ctx->main_reader) == 0 ? 0 : FLVD_Fail(ctx, site);
}

// Moves to a keyframe's position and takes the timestamp there. It must be near the one in the index: that is the only
// evidence that the index belongs to the file.
int32_t FLVD_LandOnEntry(flvd_ctx_t* ctx, int64_t position, uint32_t expected, uint32_t* result,
                         const flvd_index_sites_t& sites)
{
    if (__FLV_DMX__fioSeek64(ctx->main_reader, position, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, sites.seek);
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_HEADER_SIZE, ctx->main_reader) < FLVD_TAG_HEADER_SIZE)
        return FLVD_Fail(ctx, sites.tag_cut);
    // Type and size of the tag are not checked here: the next frame request does that anyway.
    const uint32_t timestamp = FLVD_TagTimestamp(bytes);
    if (FLVD_TimeDistance(timestamp, expected) > FLVD_INDEX_TOLERANCE_MS)
        return FLVD_Fail(ctx, sites.tolerance);
    *result = timestamp;
    return 0;
}

// Looks up the target and moves the main reader to the keyframe chosen.
int32_t FLVD_GoToChoice(flvd_ctx_t* ctx, FlvdIndex index, uint32_t target, uint32_t* result, bool backward)
{
    const flvd_index_sites_t& sites = index == FlvdIndex::InMemory ? g_flvd_memoryIndexSites : g_flvd_fileIndexSites;
    const flvd_choice_t choice = FLVD_ChooseEntry(ctx, index, target, backward);
    if (choice.what == FlvdChoice::Miss)
        return FLVD_ERR_END_OF_DATA;
    if (choice.what == FlvdChoice::Rewind)
        return FLVD_RewindByIndex(ctx, result, sites.rewind);
    int64_t position = 0;
    if (FLVD_ReadPosition(ctx, index, choice.entry, &position) != 0)
        return -1;
    return FLVD_LandOnEntry(ctx, position, choice.time, result, sites);
}

int32_t FLVD_RunIndexSeekInMemory(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, bool backward)
{
    return FLVD_GoToChoice(ctx, FlvdIndex::InMemory, target, result, backward);
}

int32_t FLVD_RunIndexSeekFromFile(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, bool backward)
{
    const flvd_keyframe_index_t& index = ctx->keyframe_index;
    if (index.entry_count != 0 && __FLV_DMX__fioSeek64(ctx->main_reader, index.times_offset, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_FILE_INDEX_TIMES_SEEK);
    return FLVD_GoToChoice(ctx, FlvdIndex::InFile, target, result, backward);
}

} // namespace

int32_t FLVD_RunFrameSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream, uint32_t direction)
{
    const bool backward = direction == FLVD_DIRECTION_BACKWARD;
    if (stream != FLVD_STREAM_VIDEO)
        return FLVD_RunAudioScanSeek(ctx, target, result, direction);
    if (ctx->seek_method == FLVD_SEEK_BY_SCAN)
        return FLVD_RunVideoScanSeek(ctx, target, result, direction);
    if (ctx->seek_method != FLVD_SEEK_BY_INDEX)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_METHOD);
    const bool memory = (ctx->options & FLVD_OPT_INDEX_IN_MEMORY) != 0;
    return memory ? FLVD_RunIndexSeekInMemory(ctx, target, result, backward)
                  : FLVD_RunIndexSeekFromFile(ctx, target, result, backward);
}

int32_t FLVD_RunFrameSeekProgressive(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                     uint32_t direction)
{
    if (stream != FLVD_STREAM_VIDEO)
        return -1;
    return FLVD_RunIndexSeekInMemory(ctx, target, result, direction == FLVD_DIRECTION_BACKWARD);
}
