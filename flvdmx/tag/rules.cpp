// The rules that all navigation functions share.

#include "flvdmx/tag/tag.h"

#include "flvdmx/fio/bytes.h"
#include "flvdmx/fio/fio.h"

namespace {

constexpr uint32_t FLVD_VIDEO_BYTE_MAX = 0x5F; // FrameType 1 to 5, any CodecID

bool FLVD_IsStreamVideo(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    if (rules.video_filter == FLVD_ANY_CODEC)
        return true;
    return header.CodecId() == (rules.video_filter & FLVD_CODEC_ID_MASK) && header.first <= FLVD_VIDEO_BYTE_MAX;
}

bool FLVD_IsStreamAudio(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    return rules.audio_filter == FLVD_ANY_CODEC || header.first == rules.audio_filter;
}

} // namespace

flvd_tag_rules_t FLVD_TagRules(const flvd_ctx_t* ctx)
{
    return {
        ctx->data_end,
        int64_t{ctx->data_offset} + FLVD_BACK_POINTER_SIZE,
        ctx->last_ts != 0 ? ctx->last_ts : UINT32_MAX,
        ctx->video_codec_filter,
        ctx->audio_format_filter,
    };
}

uint32_t FLVD_TagTimestamp(const uint8_t* bytes)
{
    return FLVD_GetBE24(bytes + FLVD_TIMESTAMP_FIELD) | uint32_t{bytes[FLVD_TIMESTAMP_FIELD + 3]} << 24;
}

flvd_tag_header_t FLVD_ReadTagHeader(const uint8_t* bytes)
{
    return {
        {bytes[0], FLVD_GetBE24(bytes + FLVD_DATA_SIZE_FIELD), FLVD_TagTimestamp(bytes),
         FLVD_GetBE24(bytes + FLVD_STREAM_ID_FIELD)},
        bytes[FLVD_CODEC_BYTE],
        bytes[FLVD_PACKET_TYPE],
    };
}

bool FLVD_PeekTagHeader(fio_file_t* file, flvd_tag_header_t* header)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, file) < FLVD_TAG_PEEK_SIZE)
        return false;
    *header = FLVD_ReadTagHeader(bytes);
    return true;
}

bool FLVD_IsStreamTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    if (header.info.timestamp > rules.max_timestamp)
        return false;
    switch (header.info.type) {
    case FLVD_TAG_TYPE_VIDEO:
        return FLVD_IsStreamVideo(rules, header);
    case FLVD_TAG_TYPE_AUDIO:
        return FLVD_IsStreamAudio(rules, header);
    default:
        return header.info.type == FLVD_TAG_TYPE_SCRIPT;
    }
}

bool FLVD_IsPlausibleTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    return int64_t{header.info.data_size} < rules.data_end && FLVD_IsStreamTag(rules, header);
}

bool FLVD_IsWantedTag(const flvd_tag_header_t& header, uint32_t wanted)
{
    if (header.IsVideo()) {
        if ((wanted & FLVD_TAG_VIDEO) == 0)
            return false;
        if ((wanted & FLVD_TAG_KEYFRAME) != 0)
            return header.IsKeyframe();
        return (wanted & FLVD_TAG_CONFIG) == 0 || !header.IsAvc() || header.second == FLVD_PACKET_SEQUENCE_HEADER;
    }
    if (header.IsAudio()) {
        if ((wanted & FLVD_TAG_AUDIO) == 0)
            return false;
        return (wanted & FLVD_TAG_CONFIG) == 0 || !header.IsAac() || header.second == FLVD_PACKET_SEQUENCE_HEADER;
    }
    return (wanted & FLVD_TAG_SCRIPT) != 0;
}

bool FLVD_IsBackPointer(const uint8_t* bytes, uint32_t data_size)
{
    return FLVD_GetBE32(bytes) == data_size + FLVD_TAG_HEADER_SIZE;
}

bool FLVD_PassBackPointer(fio_file_t* file, uint32_t data_size)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return false;
    if (FLVD_IsBackPointer(bytes, data_size))
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    return true;
}

int32_t FLVD_SeekToFirstTag(const flvd_ctx_t* ctx, fio_file_t* file)
{
    return __FLV_DMX__fioSeek64(file, ctx->data_offset, FIO_SEEK_SET);
}
