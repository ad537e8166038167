// Stream probing: walks the first tags to find the streams, their configuration and the metadata, derives duration and
// byte rate, and fills the host's records.
//
// Complete files are walked with checked back-pointers. In a growing file these may not exist yet, so headers alone
// count there, and a tag that is cut short fails the open: the host retries it when the file has more data.

#include "flvdmx/front/front.h"

#include "flvdmx/codec/codec.h"
#include "flvdmx/common/instance.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/keyframe_index.h"
#include "flvdmx/tag/tag.h"

#include <algorithm>

namespace {

// In one word with the stream bits, so that one comparison shows whether everything has been found.
constexpr uint32_t FLVD_FOUND_METADATA = 0x4;
constexpr uint32_t FLVD_FOUND_ALL = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO | FLVD_FOUND_METADATA;
constexpr uint32_t FLVD_NO_TIMESTAMP = 0xFFFFFFFF;
constexpr uint32_t FLVD_BYTE_RATE_SHIFT = 10; // bytes per 1024 ms

// What the walk has found so far. It ends as soon as `found` equals `wanted` and a first timestamp is known.
struct flvd_probing_t {
    uint32_t wanted;
    uint32_t found;
    uint32_t first_ts;
};

bool FLVD_IsProbed(const flvd_probing_t& probing)
{
    return probing.found == probing.wanted && probing.first_ts != FLVD_NO_TIMESTAMP;
}

// Probes a media tag unless its stream has been found: the first tag that describes it decides. Returns the result of
// the codec's probe, or 0 without one.
int32_t FLVD_ProbeTag(flvd_ctx_t* ctx, flvd_probing_t* probing, uint32_t tag_type)
{
    const uint32_t stream = tag_type == FLVD_TAG_TYPE_VIDEO ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
    if ((probing->found & stream) != 0)
        return 0;
    const int32_t result = stream == FLVD_STREAM_VIDEO ? FLVD_ProbeVideoTag(ctx) : FLVD_ProbeAudioTag(ctx);
    if (result == 0)
        probing->found |= stream;
    return result;
}

// Parses the script tag at the reader's position.
int32_t FLVD_ProbeScript(flvd_ctx_t* ctx, flvd_probing_t* probing, uint32_t data_size)
{
    FLVD_FioSkip(FLVD_TAG_HEADER_SIZE, ctx->cur_reader);
    const int32_t result = FLVD_ReadMetadata(ctx, data_size);
    if (result == 0)
        probing->found |= FLVD_FOUND_METADATA;
    return result;
}

// Handles a tag of a complete file. Configurations do not count towards the first timestamp: muxers repeat them, or
// write them with the time 0 whatever the time of the first frame. For AVC only the sequence header describes the
// stream, and earlier frames cannot be decoded.
void FLVD_ProbeCompleteTag(flvd_ctx_t* ctx, flvd_probing_t* probing, const flvd_tag_info_t& tag, uint32_t kind)
{
    const bool config = (kind & FLVD_TAG_CONFIG) != 0;
    bool media = false;
    if (tag.type == FLVD_TAG_TYPE_SCRIPT) {
        FLVD_ProbeScript(ctx, probing, tag.data_size);
    } else if (tag.type == FLVD_TAG_TYPE_VIDEO) {
        if (config)
            FLVD_ProbeTag(ctx, probing, tag.type);
        media = !config;
    } else {
        FLVD_ProbeTag(ctx, probing, tag.type);
        media = !config || ctx->audio_info.format_tag != FLVD_AUDIO_TAG_AAC;
    }
    if (media)
        probing->first_ts = std::min(probing->first_ts, tag.timestamp);
}

void FLVD_ProbeCompleteTags(flvd_ctx_t* ctx, flvd_probing_t* probing)
{
    for (uint32_t tags = 0; tags < FLVD_TAG_BUDGET && !FLVD_IsProbed(*probing); ++tags) {
        flvd_tag_info_t tag;
        uint32_t kind = 0;
        if (FLVD_MoveToNextTag(ctx, ctx->cur_reader, &tag, FLVD_TAG_ANY, &kind) != 0)
            return;
        FLVD_ProbeCompleteTag(ctx, probing, tag, kind);
    }
}

// Handles a tag of a growing file and moves the reader past it. After a script tag, its back-pointer may not exist yet.
flvd_site_t FLVD_ProbeGrowingTag(flvd_ctx_t* ctx, flvd_probing_t* probing, const flvd_tag_info_t& tag)
{
    if (tag.type == FLVD_TAG_TYPE_SCRIPT) {
        if (FLVD_ProbeScript(ctx, probing, tag.data_size) == FLVD_ERR_END_OF_DATA)
            return FLVD_SITE_OPEN_NO_STREAM;
        FLVD_SkipBackPointer(ctx->cur_reader, tag.data_size);
        return FLVD_SITE_NONE;
    }
    if (FLVD_ProbeTag(ctx, probing, tag.type) == FLVD_ERR_END_OF_DATA)
        return FLVD_SITE_OPEN_TAG_CUT;
    probing->first_ts = std::min(probing->first_ts, tag.timestamp);
    // Moves by the size in the header, past a back-pointer that may not exist yet.
    const int64_t size = int64_t{tag.data_size} + FLVD_TAG_OVERHEAD;
    const bool moved = __FLV_DMX__fioSeek64(ctx->cur_reader, size, FIO_SEEK_CUR) == 0;
    return moved ? FLVD_SITE_NONE : FLVD_SITE_OPEN_TAG_CUT;
}

flvd_site_t FLVD_ProbeGrowingTags(flvd_ctx_t* ctx, flvd_probing_t* probing)
{
    for (uint32_t tags = 0; tags < FLVD_TAG_BUDGET && !FLVD_IsProbed(*probing); ++tags) {
        flvd_tag_info_t tag;
        if (FLVD_GetCurrTagInfo(ctx, ctx->cur_reader, &tag, FLVD_TAG_ANY, 0) != 0)
            break;
        const flvd_site_t site = FLVD_ProbeGrowingTag(ctx, probing, tag);
        if (site != FLVD_SITE_NONE)
            return site;
    }
    return FLVD_SITE_NONE;
}

// Walks the first tags and stores the streams found and the first timestamp.
flvd_site_t FLVD_ProbeTags(flvd_ctx_t* ctx)
{
    if (FLVD_SeekToFirstTag(ctx, ctx->cur_reader) != 0)
        return FLVD_SITE_OPEN_NO_STREAM;
    // A header that announces nothing is wrong rather than true; then both streams are searched for.
    const uint32_t wanted = ctx->streams == 0 ? FLVD_FOUND_ALL : ctx->streams | FLVD_FOUND_METADATA;
    flvd_probing_t probing = {wanted, 0, FLVD_NO_TIMESTAMP};
    if (FLVD_IsGrowing(ctx)) {
        const flvd_site_t site = FLVD_ProbeGrowingTags(ctx, &probing);
        if (site != FLVD_SITE_NONE)
            return site;
    } else {
        FLVD_ProbeCompleteTags(ctx, &probing);
    }
    // From here on `streams` holds what was found, no longer what the header announces.
    ctx->streams = probing.found & (FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO);
    if (ctx->streams == 0)
        return FLVD_SITE_OPEN_NO_STREAM;
    if (probing.first_ts != FLVD_NO_TIMESTAMP)
        ctx->first_ts = probing.first_ts;
    return FLVD_SITE_NONE;
}

// Determines the last timestamp, the end of the valid data and the seek method.
bool FLVD_MeasureExtent(flvd_ctx_t* ctx)
{
    if (!FLVD_IsGrowing(ctx))
        return FLVD_ProbeExtent(ctx, ctx->opened_for_info != 0) == 0;
    ctx->seek_method = FLVD_IsIndexInMemory(ctx) ? FLVD_SEEK_BY_INDEX : FLVD_SEEK_NONE;
    ctx->file_size = 0;
    return true;
}

// Timestamps that end before they start mean that the clock restarted or that the first ones are damaged. Without a
// usable range there is nothing to seek by, and times count from 0.
void FLVD_DeriveDuration(flvd_ctx_t* ctx)
{
    if (ctx->last_ts < ctx->first_ts) {
        ctx->seek_method = FLVD_SEEK_NONE;
        ctx->first_ts = 0;
        ctx->last_ts = 0;
        ctx->duration_ms = 0;
        ctx->byte_rate = 0;
        return;
    }
    ctx->duration_ms = ctx->last_ts - ctx->first_ts;
    const bool known = ctx->duration_ms != 0 && ctx->data_end != INT64_MAX;
    // For the estimated position of a seek by scanning. A shift instead of a multiplication by 1000 keeps this free of
    // overflow for every file size below 2^53 bytes.
    const auto scaled = static_cast<int64_t>(static_cast<uint64_t>(ctx->data_end) << FLVD_BYTE_RATE_SHIFT);
    ctx->byte_rate = known ? static_cast<uint32_t>(static_cast<uint64_t>(scaled / int64_t{ctx->duration_ms})) : 0;
}

void FLVD_FillRecords(flvd_ctx_t* ctx, flvd_open_info_t* info)
{
    ctx->file_info.duration_ms = ctx->duration_ms;
    ctx->file_info.file_size = ctx->file_size;
    ctx->file_info.seek_method = ctx->seek_method;
    info->file_info = &ctx->file_info;
    if (FLVD_HasVideo(ctx)) {
        info->has_video = 1;
        info->video_info = &ctx->video_info;
        info->video_config = &ctx->video_info;
    }
    if (FLVD_HasAudio(ctx)) {
        info->has_audio = 1;
        info->audio_info = &ctx->audio_info;
        info->audio_config = &ctx->audio_info;
    }
}

} // namespace

flvd_site_t FLVD_ProbeStreams(flvd_ctx_t* ctx, flvd_open_info_t* info)
{
    const flvd_site_t site = FLVD_ProbeTags(ctx);
    if (site != FLVD_SITE_NONE)
        return site;
    if (!FLVD_MeasureExtent(ctx))
        return FLVD_SITE_OPEN_EXTENT;
    FLVD_DeriveDuration(ctx);
    if (FLVD_SeekToFirstTag(ctx, ctx->main_reader) != 0)
        return FLVD_SITE_OPEN_REWIND;
    if (FLVD_HasAudioReader(ctx) && FLVD_SeekToFirstTag(ctx, ctx->audio_reader) != 0)
        return FLVD_SITE_OPEN_REWIND;
    FLVD_FillRecords(ctx, info); // last, so that a failed open leaves the records empty
    return FLVD_SITE_NONE;
}
