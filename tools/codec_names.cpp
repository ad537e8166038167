// Names of the codecs that FLV knows.
#include "tools/codec_names.h"

#include <fmt/core.h>

#include "flvdmx/flvdmx.hpp"

namespace tool {

namespace {

constexpr uint32_t CODEC_ID_MASK = 0x0F;
constexpr uint32_t SOUND_FORMAT_SHIFT = 4;

template <typename Codec> std::string NameOf(Codec codec)
{
    const std::string name = flvdmx::name(codec);
    return name == "unknown" ? fmt::format("unknown ({})", static_cast<uint32_t>(codec)) : name;
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
    return NameOf(static_cast<flvdmx::VideoCodec>(VideoCodecId(instance)));
}

std::string AudioCodec(const flvd_ctx_t& instance)
{
    return NameOf(static_cast<flvdmx::AudioCodec>(AudioSoundFormat(instance)));
}

} // namespace tool
