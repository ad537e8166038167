// Names of the codecs that FLV knows.
#include "tools/codec_names.h"

#include <cstddef>

#include <fmt/core.h>

namespace tool {

namespace {

constexpr uint32_t CODEC_ID_MASK = 0x0F;
constexpr uint32_t SOUND_FORMAT_SHIFT = 4;

// By CodecID and SoundFormat of the FLV tag header bytes; the descriptions name only some of them.
constexpr const char* VIDEO_CODECS[] = {nullptr, "JPEG",           "Sorenson H.263", "screen video",
                                        "VP6",   "VP6 with alpha", "screen video 2", "H.264 (AVC)"};
constexpr const char* AUDIO_CODECS[] = {"PCM",
                                        "ADPCM",
                                        "MP3",
                                        "PCM, little-endian",
                                        "Nellymoser 16 kHz mono",
                                        "Nellymoser 8 kHz mono",
                                        "Nellymoser",
                                        "G.711 A-law",
                                        "G.711 mu-law",
                                        nullptr,
                                        "AAC",
                                        "Speex",
                                        nullptr,
                                        nullptr,
                                        "MP3 8 kHz"};

template <size_t N> std::string NameOf(const char* const (&names)[N], uint32_t value)
{
    return value < N && names[value] != nullptr ? names[value] : fmt::format("unknown ({})", value);
}

} // namespace

uint32_t VideoCodecId(const flvd_ctx_t& instance)
{
    return instance.video_codec_filter & CODEC_ID_MASK;
}

uint32_t AudioSoundFormat(const flvd_ctx_t& instance)
{
    return (instance.audio_format_filter & 0xFF) >> SOUND_FORMAT_SHIFT;
}

std::string VideoCodec(const flvd_ctx_t& instance)
{
    return NameOf(VIDEO_CODECS, VideoCodecId(instance));
}

std::string AudioCodec(const flvd_ctx_t& instance)
{
    return NameOf(AUDIO_CODECS, AudioSoundFormat(instance));
}

} // namespace tool
