// What codec configurations say.
#ifndef FLVDMX_TOOLS_CODEC_CONFIG_H
#define FLVDMX_TOOLS_CODEC_CONFIG_H

#include <cstdint>
#include <string>

#include "flvdmx/result.hpp"

namespace tool {

/** An AudioSpecificConfig (ISO/IEC 14496-3). */
struct AacConfig {
    uint32_t objectType = 0;     /**< as it begins: 5 or 29 for HE-AAC that is signalled */
    uint32_t coreObjectType = 0; /**< of the core of HE-AAC, else the same */
    uint32_t frequencyIndex = 0;
    uint32_t sampleRate = 0;       /**< Hz, of the core; 0 for a reserved index */
    uint32_t outputSampleRate = 0; /**< Hz, of HE-AAC that is signalled; else the same */
    uint32_t channels = 0;         /**< channel configuration */
    bool isShort = false;          /**< it ends before all that was there */
};

constexpr uint32_t AAC_EXPLICIT_FREQUENCY = 15; /**< index before a sampling frequency of 24 bits */
constexpr uint32_t AAC_FREQUENCIES = 13;        /**< indices with a meaning */

AacConfig ParseAacConfig(flvdmx::Bytes config);

/** @return such as "AAC LC"; "object type 42" for one without a name here */
std::string AacObjectTypeName(uint32_t objectType);

/** @return profile of an AVCDecoderConfigurationRecord, such as "High", "profile 44" for one without a name here */
std::string AvcProfileName(flvdmx::Bytes record);

/** Width and height in pixels; 0 when they are not known. */
struct PictureSize {
    uint32_t width = 0;
    uint32_t height = 0;
};

/** @return size of the pictures after cropping, by the first sequence parameter set of the record */
PictureSize AvcPictureSize(flvdmx::Bytes record);

/** @return its level, such as "3.1" */
std::string AvcLevelName(flvdmx::Bytes record);

} // namespace tool

#endif
