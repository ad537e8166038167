// Video: the codec byte of FLV video tags (FLV file format, version 10.1, annex E.4.3) and the picture headers of
// Sorenson H.263 and VP6. AVC is in avc.cpp.
//
// FLV has no field for the picture size. These headers have it, so that a host need not wait for metadata, which many
// files lack; where both exist, the one that comes later in the file is reported.

#include "flvdmx/codec/bit_stream.h"
#include "flvdmx/codec/codec.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/common/tag_header.h"
#include "flvdmx/fio/fio.h"

#include <cstring>
#include <iterator>

namespace {

constexpr uint32_t FLVD_VIDEO_PAYLOAD = FLVD_CODEC_BYTE_OFFSET + 1; // codecs without a packet type
constexpr uint32_t FLVD_PICTURE_PEEK = 128; // bytes of the tag that are searched for a picture header

constexpr int32_t FLVD_VIDEO_HEADER_MIN = 8; // no codec has a shorter header
// Room for the parameter sets of a record while the first of them is parsed. Larger ones count as damaged: real sets
// have 20 to 60 bytes.
constexpr int32_t FLVD_AVC_OUT_CAPACITY = 128;

// Sorenson H.263, H263VIDEOPACKET. PictureSize 0 and 1 are followed by a width and a height of 8 or 16 bits each; 2 to
// 6 stand for the sizes below, and 7 is reserved.
constexpr int32_t FLVD_H263_HEADER_MIN = 5;
constexpr uint32_t FLVD_H263_BEFORE_SIZE = 17 + 5 + 8; // PictureStartCode, Version, TemporalReference
constexpr uint32_t FLVD_H263_FIRST_FIXED = 2;

struct flvd_picture_size_t {
    uint16_t width;
    uint16_t height;
};

constexpr flvd_picture_size_t g_flvd_h263Size[] = {{352, 288}, {176, 144}, {128, 96}, {320, 240}, {160, 120}};

constexpr uint32_t FLVD_MACROBLOCK = 16; // pixels

// Offset of the first PictureStartCode, 17 bits with the value 1, or -1.
int32_t FLVD_FindH263Picture(const uint8_t* data, int32_t length)
{
    for (int32_t p = 0; p <= length - FLVD_H263_HEADER_MIN; ++p)
        if (data[p] == 0 && data[p + 1] == 0 && (data[p + 2] & 0x80u) != 0)
            return p;
    return -1;
}

// With a reserved PictureSize the size stays as it was, from the metadata or 0.
int32_t FLVD_ParseH263Header(uint32_t* width, uint32_t* height, const uint8_t* data, int32_t length)
{
    const int32_t start = FLVD_FindH263Picture(data, length);
    if (start < 0)
        return -1;
    FLVD_BitStream bits(data + start, static_cast<uint32_t>(length - start));
    bits.Skip(FLVD_H263_BEFORE_SIZE);
    const uint32_t picture_size = bits.Get(3);
    if (picture_size < FLVD_H263_FIRST_FIXED) {
        const uint32_t field = picture_size == 0 ? 8 : 16;
        *width = bits.Get(field);
        *height = bits.Get(field);
    } else if (picture_size - FLVD_H263_FIRST_FIXED < std::size(g_flvd_h263Size)) {
        const flvd_picture_size_t& size = g_flvd_h263Size[picture_size - FLVD_H263_FIRST_FIXED];
        *width = size.width;
        *height = size.height;
    }
    return 0;
}

// VP6FLVVIDEOPACKET and, with alpha, VP6FLVALPHAVIDEOPACKET. Only a keyframe has the size: in macroblocks, from which
// HorizontalAdjustment and VerticalAdjustment cut the pixels that are not shown.
int32_t FLVD_ParseVP6Header(uint32_t* width, uint32_t* height, const uint8_t* data, int32_t length, bool alpha)
{
    FLVD_BitStream bits(data, static_cast<uint32_t>(length));
    const uint32_t horizontal_adjustment = bits.Get(4);
    const uint32_t vertical_adjustment = bits.Get(4);
    bits.Skip(alpha ? 24 : 0); // OffsetToAlpha
    if (bits.Get(1) != 0)
        return -1; // not a key frame
    bits.Skip(6);  // quantizer
    const bool separated = bits.Get(1) != 0;
    bits.Skip(5); // version
    const uint32_t profile = bits.Get(2);
    bits.Skip(1);                                  // interlace
    bits.Skip(separated || profile == 0 ? 16 : 0); // coefficient offset
    bits.Skip(8 + 8);                              // coded rows and columns
    *height = FLVD_MACROBLOCK * bits.Get(8) - vertical_adjustment;
    *width = FLVD_MACROBLOCK * bits.Get(8) - horizontal_adjustment;
    return 0;
}

void FLVD_SetFourcc(flvd_ctx_t* ctx, const char* fourcc)
{
    std::memcpy(ctx->video_info.fourcc, fourcc, sizeof ctx->video_info.fourcc);
}

// Probes a codec that has a picture header at the start of its data. The peek runs into the next tags when this one is
// small; a file that ends before has no picture worth playing.
int32_t FLVD_ProbePicture(flvd_ctx_t* ctx, uint32_t codec, const char* fourcc, flvd_site_t short_site,
                          flvd_site_t header_site)
{
    const uint8_t* tag = nullptr;
    if (FLVD_FioPeek(&tag, FLVD_PICTURE_PEEK, ctx->cur_reader) < FLVD_PICTURE_PEEK)
        return FLVD_FailShort(ctx, short_site);
    if (FLVD_ParseVideoHeader(static_cast<int32_t>(codec), tag + FLVD_VIDEO_PAYLOAD,
                              FLVD_PICTURE_PEEK - FLVD_VIDEO_PAYLOAD, &ctx->video_info) != 0)
        return FLVD_Fail(ctx, header_site);
    FLVD_SetFourcc(ctx, fourcc);
    return 0;
}

// Copies the AVCDecoderConfigurationRecord of a sequence header and parses its sequence parameter set.
int32_t FLVD_ProbeAvc(flvd_ctx_t* ctx, uint32_t data_size)
{
    flvd_video_info_t& info = ctx->video_info;
    const uint8_t* tag = nullptr;
    const uint32_t size = FLVD_TAG_HEADER_SIZE + data_size;
    if (FLVD_FioPeek(&tag, size, ctx->cur_reader) < size)
        return FLVD_FailShort(ctx, FLVD_SITE_AVC_DATA);
    if (!FLVD_ReplaceConfig(&info.config, &info.config_size, tag + FLVD_CODEC_BYTE_OFFSET, data_size,
                            FLVD_AVC_HEADER_SIZE))
        return FLVD_Fail(ctx, FLVD_SITE_AVC_MEMORY);
    uint8_t parameters[FLVD_AVC_OUT_CAPACITY];
    const auto record_size = static_cast<int32_t>(info.config_size); // smaller than DataSize, which has 24 bits
    const int32_t length = FLVD_GetAVCSeqHeaderFromAvcC(info.config, record_size, parameters, FLVD_AVC_OUT_CAPACITY);
    if (length <= 0)
        return FLVD_Fail(ctx, FLVD_SITE_AVC_CONFIG);
    if (FLVD_ParseVideoHeader(FLVD_CODEC_AVC, parameters, length, &info) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_AVC_PARAMETERS);
    FLVD_SetFourcc(ctx, "H264");
    return 0;
}

// Describes the stream by CodecID. Screen video and JPEG have no size before their first decoded picture, so the
// metadata must provide it. An unknown CodecID, as that of a later extension of the format, still delivers its frames.
int32_t FLVD_ProbeCodec(flvd_ctx_t* ctx, uint32_t codec, uint32_t packet_type, uint32_t data_size)
{
    switch (codec) {
    case FLVD_CODEC_JPEG:
        FLVD_SetFourcc(ctx, "JPEG");
        return 0;
    case FLVD_CODEC_SCREEN:
        FLVD_SetFourcc(ctx, "SCR1");
        return 0;
    case FLVD_CODEC_SCREEN2:
        FLVD_SetFourcc(ctx, "SCR2");
        return 0;
    case FLVD_CODEC_H263:
        return FLVD_ProbePicture(ctx, codec, "FLV1", FLVD_SITE_H263_DATA, FLVD_SITE_H263_HEADER);
    case FLVD_CODEC_VP6:
        return FLVD_ProbePicture(ctx, codec, "VP60", FLVD_SITE_VP6_DATA, FLVD_SITE_VP6_HEADER);
    case FLVD_CODEC_VP6_ALPHA:
        return FLVD_ProbePicture(ctx, codec, "VP6A", FLVD_SITE_VP6A_DATA, FLVD_SITE_VP6A_HEADER);
    case FLVD_CODEC_AVC:
        return packet_type == FLVD_PACKET_SEQUENCE_HEADER ? FLVD_ProbeAvc(ctx, data_size)
                                                          : FLVD_Fail(ctx, FLVD_SITE_AVC_NO_SEQUENCE_HEADER);
    default:
        FLVD_SetFourcc(ctx, "\0\0\0");
        return 0;
    }
}

} // namespace

int32_t FLVD_ParseVideoHeader(int32_t codec, const uint8_t* data, int32_t length, flvd_video_info_t* info)
{
    if (length < FLVD_VIDEO_HEADER_MIN)
        return -1;
    switch (codec) {
    case FLVD_CODEC_H263:
        return FLVD_ParseH263Header(&info->width, &info->height, data, length);
    case FLVD_CODEC_VP6:
    case FLVD_CODEC_VP6_ALPHA:
        return FLVD_ParseVP6Header(&info->width, &info->height, data, length, codec == FLVD_CODEC_VP6_ALPHA);
    case FLVD_CODEC_AVC:
        return FLVD_ParseH264SPS(info, data, length);
    default:
        return -1;
    }
}

int32_t FLVD_ProbeVideoTag(flvd_ctx_t* ctx)
{
    const uint8_t* tag = nullptr;
    if (FLVD_FioPeek(&tag, FLVD_TAG_PEEK_SIZE, ctx->cur_reader) < FLVD_TAG_PEEK_SIZE)
        return FLVD_FailShort(ctx, FLVD_SITE_VIDEO_TAG);
    const uint8_t video_byte = tag[FLVD_CODEC_BYTE_OFFSET];
    // As for audio, set before the codec is understood. Of this byte, only CodecID is compared with that of other tags.
    ctx->video_codec_filter = video_byte;
    return FLVD_ProbeCodec(ctx, video_byte & FLVD_CODEC_ID_MASK, tag[FLVD_PACKET_TYPE_OFFSET],
                           FLVD_GetBE24(tag + FLVD_DATA_SIZE_OFFSET));
}
