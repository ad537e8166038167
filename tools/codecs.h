// Codecs: their names, and the fields of their configurations.
#ifndef FLVDMX_TOOLS_CODECS_H
#define FLVDMX_TOOLS_CODECS_H

#include <cstdint>
#include <string>
#include <vector>

#include "flvdmx/flvdmx.hpp"

namespace tool {

/** @return name of a video codec, with the CodecID of one that FLV does not define */
std::string CodecName(flvdmx::VideoCodec codec);
/** @return the same for audio */
std::string CodecName(flvdmx::AudioCodec codec);

/** @return true for a codec whose samples are not compressed */
constexpr bool IsPcm(flvdmx::AudioCodec codec)
{
    return codec == flvdmx::AudioCodec::pcm || codec == flvdmx::AudioCodec::pcm_little_endian;
}

/** An AudioSpecificConfig (ISO/IEC 14496-3). */
struct AacConfig {
    uint32_t objectType = 0;     /**< the first one: 5 or 29 for explicitly signalled HE-AAC */
    uint32_t coreObjectType = 0; /**< type of the HE-AAC core; otherwise equals objectType */
    uint32_t frequencyIndex = 0;
    uint32_t sampleRate = 0;       /**< Hz, of the core; 0 for a reserved index */
    uint32_t outputSampleRate = 0; /**< Hz, of explicitly signalled HE-AAC; otherwise equals sampleRate */
    uint32_t channels = 0;         /**< channel configuration */
    bool isShort = false;          /**< it ends before its last field */
};

constexpr uint32_t AAC_EXPLICIT_FREQUENCY = 15; /**< index followed by a frequency of 24 bits */
constexpr uint32_t AAC_FREQUENCIES = 13;        /**< number of indices that stand for a frequency */

AacConfig ParseAacConfig(flvdmx::Bytes config);

/** @return the name, such as "AAC LC", or "object type 42" for an unknown one */
std::string AacObjectTypeName(uint32_t objectType);

/** @return the profile of an AVCDecoderConfigurationRecord, such as "High", or "profile 44" for an unknown one */
std::string AvcProfileName(flvdmx::Bytes record);

/** @return the parameter sets of such a record, each after a start code of four bytes; empty if it is damaged */
std::vector<uint8_t> AvcParameterSets(flvdmx::Bytes record);

/** Width and height in pixels; 0 if unknown. */
struct PictureSize {
    uint32_t width = 0;
    uint32_t height = 0;
};

/** @return the size after cropping, also for AVC profiles that the library does not know. */
PictureSize PictureSizeOf(const flvdmx::VideoInfo& video);

/** @return the level of such a record, such as "3.1" */
std::string AvcLevelName(flvdmx::Bytes record);

} // namespace tool

#endif
