// Frame delivery: the next wanted tag's payload, without its codec header bytes, in the frame buffer.
//
// A growing file has a variant of its own: a tag that is not yet whole in the file is taken back, by the position
// saved in front of it, and tried again by the next request. Complete files pass such a tag over.

#include "flvdmx/front/front.h"

#include "flvdmx/fio/fio.h"
#include "flvdmx/fio/tables.h"
#include "flvdmx/instance.h"
#include "flvdmx/tag/tag.h"

namespace {

constexpr uint32_t FLVD_FRAME_BUFFER_STEP = 16384; // the frame buffer grows to multiples of it

// Failures that the two variants record at lines of their own.
struct flvd_frame_sites_t {
    flvd_site_t info_only;
    flvd_site_t no_video;
    flvd_site_t no_audio;
    flvd_site_t bad_stream;
    flvd_site_t end;
};

constexpr flvd_frame_sites_t g_flvd_completeSites = {
    {FLVD_ERR_INFO_ONLY, 2638},  {FLVD_ERR_NO_VIDEO, 2651},   {FLVD_ERR_NO_AUDIO, 2661},
    {FLVD_ERR_BAD_STREAM, 2667}, {FLVD_ERR_SHORT_DATA, 2737},
};
constexpr flvd_frame_sites_t g_flvd_growingSites = {
    {FLVD_ERR_INFO_ONLY, 2767},  {FLVD_ERR_NO_VIDEO, 2783},   {FLVD_ERR_NO_AUDIO, 2796},
    {FLVD_ERR_BAD_STREAM, 2802}, {FLVD_ERR_SHORT_DATA, 2957},
};

// Failures on one tag, by what it carries.
struct flvd_payload_sites_t {
    flvd_site_t short_peek;
    flvd_site_t no_room; // code 0: the frame was passed over on purpose
    flvd_site_t short_read;
    flvd_site_t rollback_payload;
    flvd_site_t rollback_back_pointer;
};

constexpr flvd_payload_sites_t g_flvd_videoSites = {
    {FLVD_ERR_SHORT_DATA, 2579}, {FLVD_ERR_NONE, 2602}, {FLVD_ERR_SHORT_DATA, 2606},
    {FLVD_ERR_SEEK, 2881},       {FLVD_ERR_SEEK, 2859},
};
constexpr flvd_payload_sites_t g_flvd_aacSites = {
    {FLVD_ERR_SHORT_DATA, 2521}, {FLVD_ERR_NONE, 2536}, {FLVD_ERR_SHORT_DATA, 2540},
    {FLVD_ERR_SEEK, 2921},       {FLVD_ERR_SEEK, 2899},
};
constexpr flvd_payload_sites_t g_flvd_soundSites = {
    {FLVD_ERR_SHORT_DATA, 2521}, {FLVD_ERR_NONE, 2550}, {FLVD_ERR_SHORT_DATA, 2554},
    {FLVD_ERR_SEEK, 2921},       {FLVD_ERR_SEEK, 2899},
};

// One request.
struct flvd_delivery_t {
    flvd_ctx_t* ctx;
    fio_file_t* reader;
    int64_t* saved; // growing file: position in front of the tag being delivered
    uint32_t wanted;
    bool growing;
    flvd_tag_info_t tag; // the last tag described
};

const flvd_frame_sites_t& FLVD_FrameSites(const flvd_delivery_t& delivery)
{
    return delivery.growing ? g_flvd_growingSites : g_flvd_completeSites;
}

// What a tag led to: go on with the next, return 0, or return -1 as recorded.
enum class FlvdTurn { Next, Delivered, Failed };

const flvd_payload_sites_t& FLVD_PayloadSites(uint32_t tag_type, uint8_t codec_byte)
{
    if (tag_type == FLVD_TAG_TYPE_VIDEO)
        return g_flvd_videoSites;
    return uint32_t{codec_byte} >> FLVD_SOUND_FORMAT_SHIFT == FLVD_SOUND_AAC ? g_flvd_aacSites : g_flvd_soundSites;
}

// Codec header bytes in front of a frame, 0 for a configuration packet, which is no frame.
inline uint32_t FLVD_CodecHeaderSize(uint32_t tag_type, const uint8_t* payload)
{
    const uint8_t packet_type = payload[1];
    if (tag_type == FLVD_TAG_TYPE_VIDEO) {
        if ((payload[0] & FLVD_CODEC_ID_MASK) != FLVD_CODEC_AVC)
            return FLVD_CODEC_HEADER_SIZE;
        return FLVD_IsPicturelessPacket(packet_type) ? 0 : FLVD_AVC_HEADER_SIZE;
    }
    if (uint32_t{payload[0]} >> FLVD_SOUND_FORMAT_SHIFT != FLVD_SOUND_AAC)
        return FLVD_CODEC_HEADER_SIZE;
    return packet_type == FLVD_PACKET_SEQUENCE_HEADER ? 0 : FLVD_AAC_HEADER_SIZE;
}

FlvdTurn FLVD_FailRequest(const flvd_delivery_t& delivery, flvd_site_t site)
{
    FLVD_Record(delivery.ctx, site);
    return FlvdTurn::Failed;
}

// Moves to the saved position, which is used up when that worked.
bool FLVD_GoBack(const flvd_delivery_t& delivery)
{
    if (__FLV_DMX__fioSeek64(delivery.reader, *delivery.saved, FIO_SEEK_SET) != 0)
        return false;
    *delivery.saved = 0;
    return true;
}

// A tag that is cut short: a growing file takes it back and ends the request, a complete file goes on behind it.
FlvdTurn FLVD_GiveUpTag(const flvd_delivery_t& delivery, flvd_site_t rollback)
{
    if (!delivery.growing)
        return FlvdTurn::Next;
    return FLVD_FailRequest(delivery, FLVD_GoBack(delivery) ? FLVD_FrameSites(delivery).end : rollback);
}

// A tag whose bytes are not there, although its header was.
FlvdTurn FLVD_LoseTag(const flvd_delivery_t& delivery, flvd_site_t site, flvd_site_t rollback)
{
    FLVD_Record(delivery.ctx, site);
    return FLVD_GiveUpTag(delivery, rollback);
}

// Passes the bytes that are left of a tag that is not delivered.
FlvdTurn FLVD_PassBytes(const flvd_delivery_t& delivery, uint32_t left, const flvd_payload_sites_t& sites)
{
    if (FLVD_FioSkip(left, delivery.reader) == left && FLVD_PassBackPointer(delivery.reader, delivery.tag.data_size))
        return FlvdTurn::Next;
    return FLVD_GiveUpTag(delivery, sites.rollback_back_pointer);
}

// Makes room for n bytes in the frame buffer, whose contents are lost. The caller's buffer cannot grow.
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

// Reports a frame of n bytes. The buffer may get them after that.
void FLVD_Report(const flvd_delivery_t& delivery, uint32_t n, flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.ctx;
    const bool video = delivery.tag.type == FLVD_TAG_TYPE_VIDEO;
    frame->data = ctx->frame_buffer;
    frame->size = n;
    frame->stream = video ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
    frame->timestamp_ms = delivery.tag.timestamp - ctx->first_ts;
    (video ? ctx->last_video_ts : ctx->last_audio_ts) = frame->timestamp_ms;
    if (delivery.growing)
        *delivery.saved = 0;
}

// Delivers a frame that lies in the cache with its headers and back-pointer and fits the buffer, as most do. False when
// this is none: nothing is done then.
bool FLVD_DeliverCached(const flvd_delivery_t& delivery, flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.ctx;
    fio_file_t* const reader = delivery.reader;
    const uint32_t size = delivery.tag.data_size + FLVD_TAG_OVERHEAD;
    if (size > reader->count || reader->state != FIO_STATE_READ)
        return false;
    const uint8_t* const bytes = reader->cache + reader->head;
    const uint32_t header = FLVD_CodecHeaderSize(delivery.tag.type, bytes + FLVD_CODEC_BYTE);
    const uint32_t n = delivery.tag.data_size - header;
    if (header == 0 || delivery.tag.data_size <= header || n > ctx->frame_buffer_size)
        return false;
    ctx->last_frame_size = n;
    FLVD_FioDropBits(reader);
    FLVD_FioConsume(reader, size); // first: nothing need be kept for after the copy; the bytes stay in the cache
    FLVD_Report(delivery, n, frame);
    g_flvd_fioFuncs.mem_copy(ctx->frame_buffer, bytes + FLVD_CODEC_BYTE + header, n);
    return true;
}

// Delivers the n bytes at which the reader stands.
FlvdTurn FLVD_DeliverPayload(const flvd_delivery_t& delivery, uint32_t n, const flvd_payload_sites_t& sites,
                             flvd_frame_t* frame)
{
    flvd_ctx_t* const ctx = delivery.ctx;
    if (!FLVD_MakeRoom(ctx, n)) {
        FLVD_Record(ctx, sites.no_room);
        return FLVD_PassBytes(delivery, n, sites);
    }
    if (FLVD_FioReadBytes(delivery.reader, ctx->frame_buffer, n) < n)
        return FLVD_LoseTag(delivery, sites.short_read, sites.rollback_payload);
    ctx->last_frame_size = n;
    const uint8_t* back_pointer = nullptr;
    const uint32_t available = FLVD_FioPeek(&back_pointer, FLVD_BACK_POINTER_SIZE, delivery.reader);
    if (delivery.growing && available < FLVD_BACK_POINTER_SIZE)
        return FLVD_GiveUpTag(delivery, sites.rollback_back_pointer);
    FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, delivery.reader);
    FLVD_Report(delivery, n, frame);
    return FlvdTurn::Delivered;
}

// Handles the media tag whose header the reader stands on, whatever of it is cached.
[[gnu::noinline]] FlvdTurn FLVD_DeliverTag(const flvd_delivery_t& delivery, flvd_frame_t* frame)
{
    fio_file_t* const reader = delivery.reader;
    const flvd_tag_info_t& tag = delivery.tag;
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, reader) < FLVD_TAG_PEEK_SIZE) {
        const flvd_payload_sites_t& sites = FLVD_PayloadSites(tag.type, 0); // those of AAC are alike so far
        FLVD_FioSkip(FLVD_TAG_HEADER_SIZE, reader);
        return FLVD_LoseTag(delivery, sites.short_peek, sites.rollback_payload);
    }
    const flvd_payload_sites_t& sites = FLVD_PayloadSites(tag.type, bytes[FLVD_CODEC_BYTE]);
    const uint32_t header = FLVD_CodecHeaderSize(tag.type, bytes + FLVD_CODEC_BYTE);
    if (header == 0 || tag.data_size < header)
        return FLVD_PassBytes(delivery, FLVD_TAG_HEADER_SIZE + tag.data_size, sites);
    const uint32_t headers = FLVD_TAG_HEADER_SIZE + header;
    if (FLVD_FioSkip(headers, reader) != headers) // not all of them need be cached
        return FLVD_LoseTag(delivery, sites.short_peek, sites.rollback_payload);
    return FLVD_DeliverPayload(delivery, tag.data_size - header, sites, frame);
}

// Complete file: describes the next tag, or passes what is there by the size of the last one.
FlvdTurn FLVD_TurnComplete(flvd_delivery_t* delivery, flvd_frame_t* frame)
{
    if (FLVD_FioAtEnd(delivery->reader))
        return FLVD_FailRequest(*delivery, FLVD_FrameSites(*delivery).end);
    if (FLVD_GetPlayedTag(delivery->ctx, delivery->reader, &delivery->tag, delivery->wanted) == 0)
        return FLVD_DeliverCached(*delivery, frame) ? FlvdTurn::Delivered : FLVD_DeliverTag(*delivery, frame);
    const uint32_t skipped = FLVD_FioSkip(delivery->tag.data_size + FLVD_TAG_OVERHEAD, delivery->reader);
    return skipped != 0 ? FlvdTurn::Next : FLVD_FailRequest(*delivery, FLVD_FrameSites(*delivery).end);
}

// Saves the position in front of the next tag. At the end of what was there the seek clears the host's end flag: the
// file may have grown since.
flvd_site_t FLVD_SavePosition(const flvd_delivery_t& delivery)
{
    const bool at_end = FLVD_FioAtEnd(delivery.reader);
    const int64_t position = __FLV_DMX__fioTell64(delivery.reader);
    if (position < 0)
        return FLVD_SITE_FRAME_POSITION;
    *delivery.saved = position;
    const bool resumed = !at_end || __FLV_DMX__fioSeek64(delivery.reader, position, FIO_SEEK_SET) == 0;
    return resumed ? FLVD_SITE_NONE : FLVD_SITE_FRAME_RESUME;
}

[[gnu::noinline]] FlvdTurn FLVD_TurnGrowing(flvd_delivery_t* delivery, flvd_frame_t* frame)
{
    const flvd_site_t site = FLVD_SavePosition(*delivery);
    if (FLVD_IsFailure(site))
        return FLVD_FailRequest(*delivery, site);
    const int32_t result = FLVD_GetCurrTagInfo(delivery->ctx, delivery->reader, &delivery->tag, delivery->wanted, 0);
    if (result == 0)
        return FLVD_DeliverTag(*delivery, frame);
    if (result == FLVD_ERR_END_OF_DATA)
        return FLVD_GiveUpTag(*delivery, FLVD_SITE_ROLLBACK_END);
    // A budget that is spent has moved the reader. Else a position query failed: going on would lead into the tag.
    if (__FLV_DMX__fioTell64(delivery->reader) <= *delivery->saved)
        return FLVD_FailRequest(*delivery, FLVD_GoBack(*delivery) ? FLVD_SITE_FRAME_POSITION : FLVD_SITE_ROLLBACK_SKIP);
    const int64_t size = int64_t{delivery->tag.data_size} + FLVD_TAG_OVERHEAD;
    if (__FLV_DMX__fioSeek64(delivery->reader, size, FIO_SEEK_CUR) != 0)
        return FLVD_GiveUpTag(*delivery, FLVD_SITE_ROLLBACK_SKIP);
    return FlvdTurn::Next;
}

// Chooses reader and tags by the request. Returns why it is refused.
flvd_site_t FLVD_ChooseStream(flvd_delivery_t* delivery, uint32_t stream)
{
    flvd_ctx_t* const ctx = delivery->ctx;
    if (!FLVD_HasAudioReader(ctx))
        return FLVD_SITE_NONE;
    switch (stream) {
    case FLVD_STREAM_VIDEO:
        delivery->wanted = FLVD_TAG_VIDEO;
        return FLVD_HasVideo(ctx) ? FLVD_SITE_NONE : FLVD_FrameSites(*delivery).no_video;
    case FLVD_STREAM_AUDIO:
        delivery->wanted = FLVD_TAG_AUDIO;
        delivery->reader = ctx->audio_reader;
        delivery->saved = &ctx->saved_audio_pos;
        return FLVD_HasAudio(ctx) ? FLVD_SITE_NONE : FLVD_FrameSites(*delivery).no_audio;
    default:
        return FLVD_FrameSites(*delivery).bad_stream;
    }
}

void FLVD_TakeUserBuffer(flvd_ctx_t* ctx, const flvd_frame_request_t* request)
{
    if (!FLVD_HasUserBuffer(ctx))
        return;
    ctx->frame_buffer = request->buffer;
    ctx->frame_buffer_size = request->buffer != nullptr ? request->buffer_size : 0;
}

// The tag loop.
FlvdTurn FLVD_Deliver(flvd_delivery_t* delivery, flvd_frame_t* frame)
{
    for (uint32_t turns = 0; turns < FLVD_TAG_BUDGET; ++turns) {
        const FlvdTurn turn =
            delivery->growing ? FLVD_TurnGrowing(delivery, frame) : FLVD_TurnComplete(delivery, frame);
        if (turn != FlvdTurn::Next)
            return turn;
    }
    return FLVD_FailRequest(*delivery, FLVD_FrameSites(*delivery).end);
}

} // namespace

int32_t FLVD_GetFrame(flvd_ctx_t* ctx, const flvd_frame_request_t* request, flvd_frame_t* frame)
{
    flvd_delivery_t delivery = {ctx, ctx->main_reader, &ctx->saved_main_pos, FLVD_TAG_MEDIA, FLVD_IsGrowing(ctx), {}};
    if (ctx->opened_for_info != 0)
        return FLVD_Fail(ctx, FLVD_FrameSites(delivery).info_only);
    const flvd_site_t refused = FLVD_ChooseStream(&delivery, request->stream);
    if (FLVD_IsFailure(refused))
        return FLVD_Fail(ctx, refused);
    FLVD_TakeUserBuffer(ctx, request);
    *frame = {};
    if (delivery.growing && *delivery.saved != 0 && !FLVD_GoBack(delivery))
        return FLVD_Fail(ctx, FLVD_SITE_FRAME_RESUME);
    return FLVD_Deliver(&delivery, frame) == FlvdTurn::Delivered ? 0 : -1;
}
