// Frame delivery: copies the payload of the next wanted tag, without its codec header, into the frame buffer.
//
// Growing files are handled differently: when a tag is still incomplete, the reader moves back to the position saved
// before that tag, and the next request tries again. In a complete file such a tag is skipped.
//
// A request handles one tag per turn, and gives up after FLVD_TAG_BUDGET turns without a frame, so that it returns to
// its host in bounded time. The host can retry at once: the reader stands after what has been handled.

#include "flvdmx/front/front.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/fio/tables.h"
#include "flvdmx/tag/tag.h"

namespace {

constexpr uint32_t FLVD_FRAME_BUFFER_STEP = 16384; // the size of a frame buffer that has grown is a multiple of this

// Failure sites of one tag, a set for each kind of payload.
struct flvd_payload_sites_t {
    flvd_site_t headers_cut;
    flvd_site_t no_room;
    flvd_site_t cut;
    flvd_site_t back_to_cut; // growing file: moving back to the tag failed
    flvd_site_t back_without_back_pointer;
};

// AAC and other audio differ in two sites only, but hosts know these by their line numbers.
constexpr flvd_payload_sites_t g_flvd_videoSites = {FLVD_SITE_VIDEO_HEADERS_CUT, FLVD_SITE_VIDEO_NO_ROOM,
                                                    FLVD_SITE_VIDEO_CUT, FLVD_SITE_BACK_TO_CUT_VIDEO,
                                                    FLVD_SITE_BACK_TO_VIDEO_WITHOUT_BACK_POINTER};
constexpr flvd_payload_sites_t g_flvd_aacSites = {FLVD_SITE_AUDIO_HEADERS_CUT, FLVD_SITE_AAC_NO_ROOM, FLVD_SITE_AAC_CUT,
                                                  FLVD_SITE_BACK_TO_CUT_AUDIO,
                                                  FLVD_SITE_BACK_TO_AUDIO_WITHOUT_BACK_POINTER};
constexpr flvd_payload_sites_t g_flvd_audioSites = {FLVD_SITE_AUDIO_HEADERS_CUT, FLVD_SITE_AUDIO_NO_ROOM,
                                                    FLVD_SITE_AUDIO_CUT, FLVD_SITE_BACK_TO_CUT_AUDIO,
                                                    FLVD_SITE_BACK_TO_AUDIO_WITHOUT_BACK_POINTER};

// State of one frame request.
struct flvd_delivery_t {
    // The reader, the kinds wanted, and the failed checks that are left to the whole request.
    flvd_frame_search_t search;
    int64_t* saved; // growing file: position before the tag being delivered
    bool growing;
    uint32_t passing_size; // data size of the last tag found; a stretch without tags is skipped in steps of it
};

// Outcome of handling a tag: continue with the next one, return 0, return -1 with the failure recorded, or continue the
// search because it was no tag.
enum class FlvdTurn { Next, Delivered, Failed, NoTag };

const flvd_payload_sites_t& FLVD_PayloadSites(const flvd_found_tag_t& tag)
{
    if (tag.type == FLVD_TAG_TYPE_VIDEO)
        return g_flvd_videoSites;
    return tag.codec_header == FLVD_AAC_HEADER_SIZE ? g_flvd_aacSites : g_flvd_audioSites;
}

FlvdTurn FLVD_FailRequest(const flvd_delivery_t& delivery, flvd_site_t site)
{
    FLVD_Record(delivery.search.ctx, site);
    return FlvdTurn::Failed;
}

// Moves to the saved position, and clears it on success.
bool FLVD_GoBack(const flvd_delivery_t& delivery)
{
    if (__FLV_DMX__fioSeek64(delivery.search.file, *delivery.saved, FIO_SEEK_SET) != 0)
        return false;
    *delivery.saved = 0;
    return true;
}

// Growing file: moves back to the saved position, where the next request tries again, and fails this request. For the
// host this is the end of the data so far.
FlvdTurn FLVD_RollBack(const flvd_delivery_t& delivery, flvd_site_t seek_failed)
{
    return FLVD_FailRequest(delivery, FLVD_GoBack(delivery) ? FLVD_SITE_FRAME_END : seek_failed);
}

// Handles a tag that is cut short: a complete file continues after it, a growing file rolls back.
FlvdTurn FLVD_LeaveCutTag(const flvd_delivery_t& delivery, flvd_site_t seek_failed)
{
    return delivery.growing ? FLVD_RollBack(delivery, seek_failed) : FlvdTurn::Next;
}

// Skips the remaining `left` bytes of a tag that is not delivered, and its back-pointer.
FlvdTurn FLVD_PassTag(const flvd_delivery_t& delivery, const flvd_found_tag_t& tag, uint32_t left)
{
    FLVD_FioSkip(left, delivery.search.file);
    if (FLVD_SkipBackPointer(delivery.search.file, tag.data_size))
        return FlvdTurn::Next;
    return FLVD_LeaveCutTag(delivery, FLVD_PayloadSites(tag).back_without_back_pointer);
}

// Ensures that the frame buffer holds n bytes. Growing loses its contents; the caller's own buffer cannot grow.
bool FLVD_MakeRoom(flvd_ctx_t* ctx, uint32_t n)
{
    if (n <= ctx->frame_buffer_size)
        return true;
    if (FLVD_HasUserBuffer(ctx))
        return false;
    g_flvd_memFuncs.mem_free(ctx->frame_buffer);
    const uint32_t size = (n + FLVD_FRAME_BUFFER_STEP - 1) & ~(FLVD_FRAME_BUFFER_STEP - 1); // n has 24 bits
    ctx->frame_buffer = static_cast<uint8_t*>(g_flvd_memFuncs.mem_alloc(size));
    ctx->frame_buffer_size = ctx->frame_buffer != nullptr ? size : 0;
    return ctx->frame_buffer != nullptr;
}

// Fills the record of a frame of n bytes. The payload may be copied to the buffer afterwards.
void FLVD_Report(const flvd_delivery_t& delivery, const flvd_found_tag_t& tag, uint32_t n, flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.search.ctx;
    const bool video = tag.type == FLVD_TAG_TYPE_VIDEO;
    frame->data = ctx->frame_buffer;
    frame->size = n;
    frame->stream = video ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
    frame->timestamp_ms = tag.timestamp - ctx->first_ts;
    (video ? ctx->last_video_ts : ctx->last_audio_ts) = frame->timestamp_ms;
    if (delivery.growing)
        *delivery.saved = 0;
}

// Fast path for most frames: delivers a frame that fits the buffer from a tag that is cached whole. Otherwise returns
// false and changes nothing.
bool FLVD_DeliverCached(const flvd_delivery_t& delivery, const flvd_found_tag_t& tag, flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.search.ctx;
    fio_file_t* const reader = delivery.search.file;
    // Cannot overflow: DataSize has 24 bits.
    const uint32_t size = tag.data_size + FLVD_TAG_OVERHEAD;
    if (size > reader->count || reader->state != FIO_STATE_READ)
        return false;
    const uint32_t n = tag.data_size - tag.codec_header;
    if (tag.codec_header == 0 || tag.data_size <= tag.codec_header || n > ctx->frame_buffer_size)
        return false;
    const uint8_t* const payload = FLVD_FioCached(reader) + FLVD_TAG_HEADER_SIZE + tag.codec_header;
    ctx->last_frame_size = n;
    FLVD_FioDropBits(reader);
    FLVD_FioConsume(reader, size); // before the copy: nothing stays live across it, and the bytes stay cached
    FLVD_Report(delivery, tag, n, frame);
    g_flvd_fioFuncs.mem_copy(ctx->frame_buffer, payload, n);
    return true;
}

// Checks the back-pointer of a tag whose payload was cut short after `got` bytes: it may exist anyway if a host read
// failed. On success the reader stands where the payload ended.
bool FLVD_CheckCutTag(fio_file_t* reader, const flvd_found_tag_t& tag, uint32_t got)
{
    const int64_t payload_end = tag.start + FLVD_TAG_HEADER_SIZE + tag.codec_header + got;
    if (__FLV_DMX__fioSeek64(reader, tag.start, FIO_SEEK_SET) != 0 || !FLVD_CheckPastData(reader, tag.data_size))
        return false;
    __FLV_DMX__fioSeek64(reader, payload_end, FIO_SEEK_SET); // if this fails, the search continues from here
    return true;
}

// Delivers the n bytes of payload at the reader's position.
FlvdTurn FLVD_DeliverPayload(const flvd_delivery_t& delivery, const flvd_found_tag_t& tag, uint32_t n,
                             flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.search.ctx;
    fio_file_t* const reader = delivery.search.file;
    if (!FLVD_MakeRoom(ctx, n)) {
        FLVD_Record(ctx, FLVD_PayloadSites(tag).no_room);
        return FLVD_PassTag(delivery, tag, n);
    }
    // Cached bytes are copied, the rest comes straight from the host. A tag not checked yet is read as well: if it
    // turns out to be false, nothing but the buffer has changed.
    const uint32_t got = FLVD_FioReadBytes(reader, ctx->frame_buffer, n);
    if (got < n) {
        if (!tag.checked && !FLVD_CheckCutTag(reader, tag, got))
            return FlvdTurn::NoTag;
        FLVD_Record(ctx, FLVD_PayloadSites(tag).cut);
        return FLVD_LeaveCutTag(delivery, FLVD_PayloadSites(tag).back_to_cut);
    }
    const uint8_t* back_pointer = nullptr;
    // This peek refills the cache, so the next tag is usually there when it is requested.
    const bool ended = FLVD_FioPeek(&back_pointer, FLVD_BACK_POINTER_SIZE, reader) < FLVD_BACK_POINTER_SIZE;
    if (!tag.checked && (ended || !FLVD_IsBackPointer(back_pointer, tag.data_size)))
        return FlvdTurn::NoTag;
    ctx->last_frame_size = n;
    if (ended && delivery.growing)
        return FLVD_RollBack(delivery, FLVD_PayloadSites(tag).back_without_back_pointer);
    FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, reader);
    FLVD_Report(delivery, tag, n, frame);
    return FlvdTurn::Delivered;
}

// Handles the media tag at the reader's position, however much of it is cached.
[[gnu::noinline]] FlvdTurn FLVD_DeliverTag(const flvd_delivery_t& delivery, const flvd_found_tag_t& tag,
                                           flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.search.ctx;
    fio_file_t* const reader = delivery.search.file;
    const uint32_t headers = FLVD_TAG_HEADER_SIZE + tag.codec_header;
    const uint8_t* bytes = nullptr;
    if (!tag.checked) {
        FLVD_FioPeek(&bytes, headers, reader); // so that the skip below does not seek
    } else if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, reader) < FLVD_TAG_PEEK_SIZE) {
        FLVD_FioSkip(FLVD_TAG_HEADER_SIZE, reader);
        FLVD_Record(ctx, FLVD_PayloadSites(tag).headers_cut);
        return FLVD_LeaveCutTag(delivery, FLVD_PayloadSites(tag).back_to_cut);
    }
    // A configuration, an end of sequence, or a tag too short for its codec header: there is no frame in it.
    if (tag.codec_header == 0 || tag.data_size < tag.codec_header)
        return FLVD_PassTag(delivery, tag, FLVD_TAG_HEADER_SIZE + tag.data_size);
    if (FLVD_FioSkip(headers, reader) != headers) {
        FLVD_Record(ctx, FLVD_PayloadSites(tag).headers_cut);
        return FLVD_LeaveCutTag(delivery, FLVD_PayloadSites(tag).back_to_cut);
    }
    return FLVD_DeliverPayload(delivery, tag, tag.data_size - tag.codec_header, frame);
}

// Complete file, no tag found: skips ahead by the size of the last tag, unless the budget of failed checks is used up.
FlvdTurn FLVD_PassPlace(const flvd_delivery_t& delivery)
{
    // After 16,384 false headers more of them are likely, and each costs host calls. Ending the request here lets the
    // host decide whether to continue.
    const bool checks_used_up = delivery.search.checks_left == 0;
    if (checks_used_up || FLVD_FioSkip(delivery.passing_size + FLVD_TAG_OVERHEAD, delivery.search.file) == 0)
        return FLVD_FailRequest(delivery, FLVD_SITE_FRAME_END);
    return FlvdTurn::Next;
}

// One turn in a complete file. A tag that turns out to be false does not end the turn: the search continues inside it,
// because real tags may begin there.
FlvdTurn FLVD_TurnComplete(flvd_delivery_t* delivery, flvd_frame_t* frame)
{
    flvd_frame_search_t* const search = &delivery->search;
    if (FLVD_FioAtEnd(search->file))
        return FLVD_FailRequest(*delivery, FLVD_SITE_FRAME_END);
    flvd_found_tag_t tag;
    int32_t result = FLVD_FindFrameTag(search, &tag);
    while (result == 0) {
        if (FLVD_DeliverCached(*delivery, tag, frame))
            return FlvdTurn::Delivered;
        const FlvdTurn turn = FLVD_DeliverTag(*delivery, tag, frame);
        if (turn != FlvdTurn::NoTag) {
            delivery->passing_size = tag.data_size;
            return turn;
        }
        result = FLVD_FindFrameTagAfterBad(search, &tag);
    }
    return FLVD_PassPlace(*delivery);
}

// Saves the position before the next tag. At the end of the file, seeks there to clear the host's end flag, since the
// file may have grown.
flvd_site_t FLVD_BeginTurn(const flvd_delivery_t& delivery)
{
    fio_file_t* const reader = delivery.search.file;
    const bool at_end = FLVD_FioAtEnd(reader);
    const int64_t position = FLVD_FioTell(reader);
    if (position < 0)
        return FLVD_SITE_FRAME_POSITION;
    *delivery.saved = position;
    const bool resumed = !at_end || __FLV_DMX__fioSeek64(reader, position, FIO_SEEK_SET) == 0;
    return resumed ? FLVD_SITE_NONE : FLVD_SITE_FRAME_RESUME;
}

// One turn in a growing file. Headers are trusted, so each turn can start from the saved position again.
[[gnu::noinline]] FlvdTurn FLVD_TurnGrowing(flvd_delivery_t* delivery, flvd_frame_t* frame)
{
    flvd_frame_search_t& search = delivery->search;
    const flvd_site_t site = FLVD_BeginTurn(*delivery);
    if (site != FLVD_SITE_NONE)
        return FLVD_FailRequest(*delivery, site);
    flvd_tag_info_t info;
    const int32_t result = FLVD_GetCurrTagInfo(search.ctx, search.file, &info, search.wanted, 0);
    if (result == 0) {
        flvd_tag_header_t header = {};
        FLVD_PeekTagHeader(search.file, &header); // cached, since the search has just examined it
        delivery->passing_size = info.data_size;
        return FLVD_DeliverTag(*delivery, FLVD_CheckedTag(header), frame);
    }
    if (result == FLVD_ERR_END_OF_DATA)
        return FLVD_RollBack(*delivery, FLVD_SITE_BACK_FROM_END);
    const int64_t size = int64_t{delivery->passing_size} + FLVD_TAG_OVERHEAD;
    if (__FLV_DMX__fioSeek64(search.file, size, FIO_SEEK_CUR) != 0)
        return FLVD_RollBack(*delivery, FLVD_SITE_BACK_FROM_SKIP);
    return FlvdTurn::Next;
}

// With a separate audio reader, chooses the reader and the tags for the requested stream. Returns the site of a
// refusal, or FLVD_SITE_NONE.
flvd_site_t FLVD_ChooseStream(flvd_delivery_t* delivery, uint32_t stream)
{
    flvd_ctx_t* const ctx = delivery->search.ctx;
    if (!FLVD_HasAudioReader(ctx))
        return FLVD_SITE_NONE;
    switch (stream) {
    case FLVD_STREAM_VIDEO:
        delivery->search.wanted = FLVD_TAG_VIDEO;
        return FLVD_HasVideo(ctx) ? FLVD_SITE_NONE : FLVD_SITE_FRAME_NO_VIDEO;
    case FLVD_STREAM_AUDIO:
        delivery->search.wanted = FLVD_TAG_AUDIO;
        delivery->search.file = ctx->audio_reader;
        delivery->saved = &ctx->saved_audio_pos;
        return FLVD_HasAudio(ctx) ? FLVD_SITE_NONE : FLVD_SITE_FRAME_NO_AUDIO;
    default:
        return FLVD_SITE_FRAME_BAD_STREAM;
    }
}

} // namespace

int32_t FLVD_GetFrame(flvd_ctx_t* ctx, const flvd_frame_request_t* request, flvd_frame_t* frame)
{
    flvd_delivery_t delivery = {
        {ctx, ctx->main_reader, FLVD_TAG_MEDIA, FLVD_FAILED_CHECKS_MAX}, &ctx->saved_main_pos, FLVD_IsGrowing(ctx), 0};
    if (ctx->opened_for_info != 0)
        return FLVD_Fail(ctx, FLVD_SITE_FRAME_INFO_ONLY);
    const flvd_site_t refused = FLVD_ChooseStream(&delivery, request->stream);
    if (refused != FLVD_SITE_NONE)
        return FLVD_Fail(ctx, refused);
    if (FLVD_HasUserBuffer(ctx)) {
        ctx->frame_buffer = request->buffer;
        ctx->frame_buffer_size = request->buffer != nullptr ? request->buffer_size : 0;
    }
    // Only now, so that a refused request leaves the record as it was.
    *frame = {};
    // The previous request could not move back to its incomplete tag. Without that, delivery would continue in the
    // middle of it.
    if (delivery.growing && *delivery.saved != 0 && !FLVD_GoBack(delivery))
        return FLVD_Fail(ctx, FLVD_SITE_FRAME_RESUME);
    for (uint32_t turns = 0; turns < FLVD_TAG_BUDGET; ++turns) {
        const FlvdTurn turn =
            delivery.growing ? FLVD_TurnGrowing(&delivery, frame) : FLVD_TurnComplete(&delivery, frame);
        if (turn != FlvdTurn::Next)
            return turn == FlvdTurn::Delivered ? 0 : -1;
    }
    return FLVD_Fail(ctx, FLVD_SITE_FRAME_END);
}
