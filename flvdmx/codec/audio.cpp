// Audio: the codec byte of FLV audio tags (FLV file format, version 10.1, annex E.4.2), the AAC AudioSpecificConfig
// (ISO/IEC 14496-3) and the MPEG audio frame header (ISO/IEC 11172-3, 13818-3).
//
// The codec byte alone describes most formats, but it can only express four rates and two channels. For AAC and MPEG
// audio the stream's own header overrides it.

#include "flvdmx/codec/bit_stream.h"
#include "flvdmx/codec/codec.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/common/tag_header.h"
#include "flvdmx/fio/fio.h"

#include <algorithm>
#include <iterator>

namespace {

// Bytes of the tag that are examined.
constexpr uint32_t FLVD_AUDIO_PEEK = FLVD_CODEC_BYTE_OFFSET + 1; // tag header and codec byte
constexpr uint32_t FLVD_MP3_PEEK = 16;                           // tag header, codec byte and one MPEG frame header

constexpr uint32_t FLVD_SAMPLE_BITS = 16; // the size after decoding, whatever SoundSize says

// By SoundRate, in Hz. The lowest is the nominal 5.5 kHz; its exact value would be 44100 / 8 = 5512.5.
constexpr uint32_t g_flvd_soundRate[] = {5500, 11025, 22050, 44100};

// ISO/IEC 14496-3, by samplingFrequencyIndex: 13 and 14 are reserved, 15 is followed by the frequency itself.
constexpr uint32_t g_flvd_aacFrequency[] = {96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                            22050, 16000, 12000, 11025, 8000,  7350};
static_assert(std::size(g_flvd_aacFrequency) == 13, "one entry per index");
constexpr uint32_t FLVD_AAC_EXPLICIT_FREQUENCY = 15;

// ISO/IEC 14496-3: channels by channelConfiguration; 8 to 15 are reserved.
constexpr uint8_t g_flvd_aacChannels[] = {0, 1, 2, 3, 4, 5, 6, 8};

// ISO/IEC 14496-3: audioObjectType.
constexpr uint32_t FLVD_AAC_SBR = 5;
constexpr uint32_t FLVD_AAC_ESCAPE = 31;
constexpr uint32_t FLVD_AAC_TYPES_GA = // bit n: type n carries a GASpecificConfig
    1u << 1 | 1u << 2 | 1u << 3 | 1u << 4 | 1u << 6 | 1u << 7 | 1u << 17 | 1u << 19 | 1u << 20 | 1u << 21 | 1u << 22 |
    1u << 23;

// ISO/IEC 11172-3 and 13818-3, indexed by the raw header fields. Version: 0 MPEG-2.5, 1 reserved, 2 MPEG-2, 3 MPEG-1.
// Layer: 0 reserved, 1 III, 2 II, 3 I.
constexpr uint32_t FLVD_MPEG_VERSION_RESERVED = 1;
constexpr uint32_t FLVD_MPEG_LAYER_RESERVED = 0;
constexpr uint32_t FLVD_MPEG_RATE_RESERVED = 3;

constexpr uint16_t g_flvd_mpegBitRate[4][4][16] = {
    // kbit/s; index 0 is free format, 15 is forbidden
    {{},
     {0, 8, 16, 24, 32, 40, 48, 56, 64, 80, 96, 112, 128, 144, 160, 0},
     {0, 8, 16, 24, 32, 40, 48, 56, 64, 80, 96, 112, 128, 144, 160, 0},
     {0, 32, 48, 56, 64, 80, 96, 112, 128, 144, 160, 176, 192, 224, 256, 0}},
    {},
    {{},
     {0, 8, 16, 24, 32, 40, 48, 56, 64, 80, 96, 112, 128, 144, 160, 0},
     {0, 8, 16, 24, 32, 40, 48, 56, 64, 80, 96, 112, 128, 144, 160, 0},
     {0, 32, 48, 56, 64, 80, 96, 112, 128, 144, 160, 176, 192, 224, 256, 0}},
    {{},
     {0, 32, 40, 48, 56, 64, 80, 96, 112, 128, 160, 192, 224, 256, 320, 0},
     {0, 32, 48, 56, 64, 80, 96, 112, 128, 160, 192, 224, 256, 320, 384, 0},
     {0, 32, 64, 96, 128, 160, 192, 224, 256, 288, 320, 352, 384, 416, 448, 0}},
};

constexpr uint16_t g_flvd_mpegSampleRate[4][4] = {
    {11025, 12000, 8000, 0}, {}, {22050, 24000, 16000, 0}, {44100, 48000, 32000, 0}};

constexpr uint8_t g_flvd_mpegChannels[] = {2, 2, 2, 1}; // stereo, joint stereo, dual channel, single channel
constexpr uint8_t g_flvd_mpegFormatTag[] = {0, FLVD_AUDIO_TAG_MP3, FLVD_AUDIO_TAG_MPEG, FLVD_AUDIO_TAG_MP3};
constexpr int32_t FLVD_MPEG_HEADER_SIZE = 4;

// GetAudioObjectType(): types from 32 on follow an escape code.
uint32_t FLVD_GetObjectType(FLVD_BitStream* bits)
{
    const uint32_t type = bits->Get(5);
    return type == FLVD_AAC_ESCAPE ? 32 + bits->Get(6) : type;
}

// Reads a samplingFrequencyIndex and, if it follows, the explicit frequency. 0 for a reserved index.
uint32_t FLVD_GetFrequency(FLVD_BitStream* bits)
{
    const uint32_t index = bits->Get(4);
    if (index == FLVD_AAC_EXPLICIT_FREQUENCY)
        return bits->Get(24);
    return index < std::size(g_flvd_aacFrequency) ? g_flvd_aacFrequency[index] : 0;
}

// Number of channel elements in a program_config_element. A channel pair counts as one element.
uint32_t FLVD_GetProgramElements(FLVD_BitStream* bits)
{
    bits->Skip(4 + 2 + 4); // element_instance_tag, object_type, sampling_frequency_index
    const uint32_t front = bits->Get(4);
    const uint32_t side = bits->Get(4);
    const uint32_t back = bits->Get(4);
    const uint32_t lfe = bits->Get(2);
    return front + side + back + lfe;
}

// Parses an AudioSpecificConfig (ISO/IEC 14496-3). A short one reads as if zeros followed.
void FLVD_ParseAudioSpecificConfig(const uint8_t* data, uint32_t size, flvd_audio_info_t* info)
{
    FLVD_BitStream bits(data, size);
    uint32_t type = FLVD_GetObjectType(&bits);
    info->sample_rate = FLVD_GetFrequency(&bits);
    const uint32_t configuration = bits.Get(4);
    info->channels = configuration < std::size(g_flvd_aacChannels) ? g_flvd_aacChannels[configuration] : 0;
    // Hierarchical signalling of spectral band replication: the extension comes first, and the object type of the core,
    // whose GASpecificConfig follows, after it.
    if (type == FLVD_AAC_SBR) {
        FLVD_GetFrequency(&bits); // the extension's; the core's is reported
        type = FLVD_GetObjectType(&bits);
    }
    if (type >= 32 || (FLVD_AAC_TYPES_GA >> type & 1u) == 0)
        return;
    // GASpecificConfig. channelConfiguration 0 means that a program_config_element lists the channels.
    bits.Skip(1); // frameLengthFlag
    const bool depends_on_core = bits.Get(1) != 0;
    bits.Skip(depends_on_core ? 14 + 1 : 1); // coreCoderDelay, extensionFlag
    if (configuration == 0)
        info->channels = FLVD_GetProgramElements(&bits);
}

// Parses the frame header at p. False, with nothing written, when there is none.
bool FLVD_ReadMpegHeader(const uint8_t* p, flvd_audio_info_t* info)
{
    const uint32_t version = p[1] >> 3u & 3u;
    const uint32_t layer = p[1] >> 1u & 3u;
    const uint32_t rate = p[2] >> 2u & 3u;
    const bool synchronised = p[0] == 0xFF && (p[1] & 0xE0u) == 0xE0u;
    if (!synchronised || layer == FLVD_MPEG_LAYER_RESERVED || version == FLVD_MPEG_VERSION_RESERVED ||
        rate == FLVD_MPEG_RATE_RESERVED)
        return false;
    info->sample_size = FLVD_SAMPLE_BITS;
    info->format_tag = g_flvd_mpegFormatTag[layer];
    info->sample_rate = g_flvd_mpegSampleRate[version][rate];
    info->data_rate = g_flvd_mpegBitRate[version][layer][p[2] >> 4u];
    info->channels = g_flvd_mpegChannels[p[3] >> 6u];
    return true;
}

// An encoder may put other bytes before the first frame, and a tag may begin inside a frame. So this takes the first
// four bytes that can be a header; sync words inside compressed data are rare enough.
int32_t FLVD_ParseMpegAudioHeader(const uint8_t* data, int32_t length, flvd_audio_info_t* info)
{
    if (length < FLVD_MPEG_HEADER_SIZE)
        return -1;
    for (int32_t p = 0; p <= length - FLVD_MPEG_HEADER_SIZE; ++p)
        if (FLVD_ReadMpegHeader(data + p, info))
            return 0;
    return -1;
}

// Describes MPEG audio. The header is searched in the first 16 bytes of the tag, its tag header included. Layers I and
// II are reported as MP3 too, because that is how FLV labels them.
int32_t FLVD_ProbeMp3(flvd_ctx_t* ctx, uint32_t format, flvd_site_t short_site, flvd_site_t header_site)
{
    const uint8_t* tag = nullptr;
    if (FLVD_FioPeek(&tag, FLVD_MP3_PEEK, ctx->cur_reader) < FLVD_MP3_PEEK)
        return FLVD_FailShort(ctx, short_site);
    if (FLVD_ParseAudioHeader(static_cast<int32_t>(format), tag, FLVD_MP3_PEEK, &ctx->audio_info) != 0)
        return FLVD_Fail(ctx, header_site);
    ctx->audio_info.format_tag = FLVD_AUDIO_TAG_MP3;
    return 0;
}

// When the tag is a sequence header, copies and parses its AudioSpecificConfig. Without one (a recording that began in
// mid-stream), the stream is still playable for a decoder that gets the configuration by other means, so the values
// of the codec byte stay.
int32_t FLVD_ProbeAac(flvd_ctx_t* ctx)
{
    flvd_audio_info_t& info = ctx->audio_info;
    const uint8_t* tag = nullptr;
    if (FLVD_FioPeek(&tag, FLVD_TAG_PEEK_SIZE, ctx->cur_reader) < FLVD_TAG_PEEK_SIZE)
        return FLVD_FailShort(ctx, FLVD_SITE_AUDIO_TAG);
    if (tag[FLVD_PACKET_TYPE_OFFSET] == FLVD_PACKET_SEQUENCE_HEADER) {
        const uint32_t data_size = FLVD_GetBE24(tag + FLVD_DATA_SIZE_OFFSET);
        const uint32_t size = FLVD_TAG_HEADER_SIZE + data_size;
        if (FLVD_FioPeek(&tag, size, ctx->cur_reader) < size)
            return FLVD_FailShort(ctx, FLVD_SITE_AAC_DATA);
        if (!FLVD_ReplaceConfig(&info.config, &info.config_size, tag + FLVD_TAG_HEADER_SIZE, data_size,
                                FLVD_AAC_HEADER_SIZE))
            return FLVD_Fail(ctx, FLVD_SITE_AAC_MEMORY);
        FLVD_ParseAudioSpecificConfig(info.config, info.config_size, &info);
    }
    info.format_tag = FLVD_AUDIO_TAG_AAC;
    return 0;
}

// A SoundFormat that is not listed needs no configuration: linear PCM, ADPCM, Nellymoser, A-law, mu-law, Speex.
int32_t FLVD_ProbeSoundFormat(flvd_ctx_t* ctx, uint8_t audio_byte)
{
    const uint32_t format = uint32_t{audio_byte} >> FLVD_SOUND_FORMAT_SHIFT;
    switch (format) {
    case FLVD_SOUND_MP3:
        return FLVD_ProbeMp3(ctx, format, FLVD_SITE_MP3_DATA, FLVD_SITE_MP3_HEADER);
    case FLVD_SOUND_MP3_8KHZ:
        return FLVD_ProbeMp3(ctx, format, FLVD_SITE_MP3_8KHZ_DATA, FLVD_SITE_MP3_8KHZ_HEADER);
    case FLVD_SOUND_AAC:
        return FLVD_ProbeAac(ctx);
    default:
        ctx->audio_info.format_tag = 0;
        return 0;
    }
}

} // namespace

int32_t FLVD_ParseAudioHeader(int32_t format, const uint8_t* data, int32_t length, flvd_audio_info_t* info)
{
    switch (format) {
    case FLVD_SOUND_AAC:
        FLVD_ParseAudioSpecificConfig(data, static_cast<uint32_t>(std::max(length, 0)), info);
        return 0;
    case FLVD_SOUND_MP3:
    case FLVD_SOUND_MP3_8KHZ:
        return FLVD_ParseMpegAudioHeader(data, length, info);
    default:
        return -1;
    }
}

int32_t FLVD_ProbeAudioTag(flvd_ctx_t* ctx)
{
    const uint8_t* tag = nullptr;
    if (FLVD_FioPeek(&tag, FLVD_AUDIO_PEEK, ctx->cur_reader) < FLVD_AUDIO_PEEK)
        return FLVD_FailShort(ctx, FLVD_SITE_AUDIO_TAG);
    const uint8_t audio_byte = tag[FLVD_CODEC_BYTE_OFFSET];
    // Set before the format is understood: from here on, tags with another codec byte do not count as tags of this
    // file.
    ctx->audio_format_filter = audio_byte;
    flvd_audio_info_t& info = ctx->audio_info;
    info.sample_rate = g_flvd_soundRate[audio_byte >> 2u & 3u];
    info.sample_size = FLVD_SAMPLE_BITS;
    info.channels = (audio_byte & 1u) != 0 ? 2 : 1;
    const int32_t result = FLVD_ProbeSoundFormat(ctx, audio_byte);
    if (result == 0)
        info.reserved2 = 0;
    return result;
}
