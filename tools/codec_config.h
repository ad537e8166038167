// Fields of codec configurations.
#ifndef FLVDMX_TOOLS_CODEC_CONFIG_H
#define FLVDMX_TOOLS_CODEC_CONFIG_H

#include <cstdint>
#include <string>

#include "flvdmx/flvdmx.hpp"

namespace tool {

/** An AudioSpecificConfig (ISO/IEC 14496-3). */
struct AacConfig {
    uint32_t objectType = 0;     /**< the first one: 5 or 29 for explicitly signalled HE-AAC */
    uint32_t coreObjectType = 0; /**< of the core of HE-AAC, otherwise the same */
    uint32_t frequencyIndex = 0;
    uint32_t sampleRate = 0;       /**< Hz, of the core; 0 for a reserved index */
    uint32_t outputSampleRate = 0; /**< Hz, of explicitly signalled HE-AAC; otherwise the same */
    uint32_t channels = 0;         /**< channel configuration */
    bool isShort = false;          /**< it ends before its last field */
};

constexpr uint32_t AAC_EXPLICIT_FREQUENCY = 15; /**< index that a frequency of 24 bits follows */
constexpr uint32_t AAC_FREQUENCIES = 13;        /**< number of indices that stand for a frequency */

AacConfig ParseAacConfig(flvdmx::Bytes config);

/** @return such as "AAC LC"; "object type 42" for one that is not known here */
std::string AacObjectTypeName(uint32_t objectType);

/** @return profile of an AVCDecoderConfigurationRecord, such as "High", "profile 44" for one that is not known here */
std::string AvcProfileName(flvdmx::Bytes record);

/** Width and height in pixels; 0 when they are not known. */
struct PictureSize {
    uint32_t width = 0;
    uint32_t height = 0;
};

/** @return size after cropping. The library reads no chroma format for some AVC profiles and then has a wrong size. */
PictureSize PictureSizeOf(const flvdmx::VideoInfo& video);

/** @return level of such a record, such as "3.1" */
std::string AvcLevelName(flvdmx::Bytes record);

} // namespace tool

#endif
