#include "config.h"

#include "open_lock.h"

#include <array>
#include <cstdint>

namespace flvdmx_gst {

namespace {

constexpr size_t avc_record_min = 7; // AVCDecoderConfigurationRecord (ISO/IEC 14496-15) without parameter sets
constexpr uint8_t avc_record_version = 1;
constexpr size_t aac_config_min = 2; // AudioSpecificConfig (ISO/IEC 14496-3)

} // namespace

bool set_config(flvdmx::VideoInfo& info, flvdmx::Bytes config)
{
    if (config.size() < avc_record_min || *config.begin() != avc_record_version)
        return false;
    std::array<uint8_t, 1024> sets{};
    const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(config.data(), static_cast<int32_t>(config.size()), sets.data(),
                                                      static_cast<int32_t>(sets.size()));
    flvd_video_info_t picture{};
    {
        const std::lock_guard<OpenLock> lock(open_lock); // the parser is shared by the whole process
        FLVD_ParseVideoHeader(static_cast<int32_t>(info.codec), sets.data(), size, &picture);
    }
    info.config.assign(config.begin(), config.end());
    info.width = picture.width; // 0 if it cannot be read
    info.height = picture.height;
    return true;
}

bool set_config(flvdmx::AudioInfo& info, flvdmx::Bytes config)
{
    flvd_audio_info_t sound{};
    FLVD_ParseAudioHeader(static_cast<int32_t>(info.codec), config.data(), static_cast<int32_t>(config.size()), &sound);
    if (config.size() < aac_config_min || sound.sample_rate == 0)
        return false;
    info.config.assign(config.begin(), config.end());
    info.sample_rate = sound.sample_rate;
    info.channels = sound.channels;
    return true;
}

} // namespace flvdmx_gst
