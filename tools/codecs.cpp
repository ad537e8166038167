// Codecs.
#include "tools/codecs.h"

#include <algorithm>
#include <array>
#include <vector>

#include <fmt/core.h>

#include "flvdmx/layers.h"

namespace tool {

namespace {

constexpr uint32_t ESCAPED_OBJECT_TYPE = 31;
constexpr uint32_t SBR_OBJECT_TYPE = 5; // HE-AAC: output rate and core type follow
constexpr uint32_t PS_OBJECT_TYPE = 29; // HE-AAC version 2, likewise

// Reads a configuration bit by bit; bits past its end are 0.
class Bits {
public:
    explicit Bits(flvdmx::Bytes bytes) : m_bytes(bytes) {}

    uint32_t Take(uint32_t count)
    {
        uint32_t value = 0;
        for (; count > 0; --count, ++m_taken)
            value = value << 1 | (uint32_t{m_bytes[m_taken / 8]} >> (7 - m_taken % 8) & 1U);
        return value;
    }
    uint32_t TakeObjectType()
    {
        const uint32_t objectType = Take(5);
        return objectType == ESCAPED_OBJECT_TYPE ? 32 + Take(6) : objectType;
    }
    uint32_t TakeFrequency(uint32_t index)
    {
        constexpr std::array<uint32_t, AAC_FREQUENCIES> FREQUENCIES = {96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                                                       22050, 16000, 12000, 11025, 8000,  7350};
        constexpr uint32_t EXPLICIT_BITS = 24;
        if (index == AAC_EXPLICIT_FREQUENCY)
            return Take(EXPLICIT_BITS);
        return index < FREQUENCIES.size() ? FREQUENCIES[index] : 0;
    }
    bool AreShort() const { return m_taken > m_bytes.size() * 8; }

private:
    flvdmx::Bytes m_bytes;
    size_t m_taken = 0;
};

} // namespace

// CodecID 12 and 13 belong to no standard, but encoders have written them for years.
std::string CodecName(flvdmx::VideoCodec codec)
{
    const auto id = static_cast<uint32_t>(codec);
    const std::string name = flvdmx::name(codec);
    return name != "unknown" ? name : fmt::format("{} (CodecID {})", id == 12 ? "HEVC" : id == 13 ? "AV1" : name, id);
}

std::string CodecName(flvdmx::AudioCodec codec)
{
    const std::string name = flvdmx::name(codec);
    return name == "unknown" ? fmt::format("unknown (SoundFormat {})", static_cast<uint32_t>(codec)) : name;
}

AacConfig ParseAacConfig(flvdmx::Bytes config)
{
    Bits bits(config);
    AacConfig aac;
    aac.objectType = aac.coreObjectType = bits.TakeObjectType();
    aac.frequencyIndex = bits.Take(4);
    aac.sampleRate = aac.outputSampleRate = bits.TakeFrequency(aac.frequencyIndex);
    aac.channels = bits.Take(4);
    if (aac.objectType == SBR_OBJECT_TYPE || aac.objectType == PS_OBJECT_TYPE) {
        aac.outputSampleRate = bits.TakeFrequency(bits.Take(4));
        aac.coreObjectType = bits.TakeObjectType();
    }
    aac.isShort = bits.AreShort();
    return aac;
}

std::string AacObjectTypeName(uint32_t objectType)
{
    switch (objectType) {
    case 1:
        return "AAC Main";
    case 2:
        return "AAC LC";
    case 3:
        return "AAC SSR";
    case 4:
        return "AAC LTP";
    case SBR_OBJECT_TYPE:
        return "HE-AAC";
    case PS_OBJECT_TYPE:
        return "HE-AAC v2";
    default:
        return fmt::format("object type {}", objectType);
    }
}

std::string AvcProfileName(flvdmx::Bytes record)
{
    constexpr uint8_t CONSTRAINED = 0x40; // constraint_set1_flag
    switch (record[1]) {
    case 66:
        return (record[2] & CONSTRAINED) != 0 ? "Constrained Baseline" : "Baseline";
    case 77:
        return "Main";
    case 88:
        return "Extended";
    case 100:
        return "High";
    case 110:
        return "High 10";
    case 122:
        return "High 4:2:2";
    case 244:
        return "High 4:4:4 Predictive";
    default:
        return fmt::format("profile {}", record[1]);
    }
}

// A start code is two bytes longer than the length of a parameter set, so the record at most doubles.
std::vector<uint8_t> AvcParameterSets(flvdmx::Bytes record)
{
    std::vector<uint8_t> sets(2 * record.size());
    const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(record.data(), static_cast<int32_t>(record.size()), sets.data(),
                                                      static_cast<int32_t>(sets.size()));
    sets.resize(size > 0 ? static_cast<size_t>(size) : 0);
    return sets;
}

// The library reads the chroma format of High 4:2:2 (122) and lower profiles only. Later profiles have the same fields
// in the same place, so it reads their sets under that number.
PictureSize PictureSizeOf(const flvdmx::VideoInfo& video)
{
    constexpr size_t PROFILE = 5; // profile_idc in the first set, after a start code and the NAL unit header
    constexpr std::array<uint8_t, 9> WITH_CHROMA_FORMAT = {44, 83, 86, 118, 128, 134, 135, 138, 244};
    constexpr uint8_t HIGH_422 = 122;
    std::vector<uint8_t> sets = AvcParameterSets(video.config);
    if (sets.size() <= PROFILE)
        return {video.width, video.height};
    const auto* const known = std::find(WITH_CHROMA_FORMAT.begin(), WITH_CHROMA_FORMAT.end(), sets[PROFILE]);
    sets[PROFILE] = known == WITH_CHROMA_FORMAT.end() ? sets[PROFILE] : HIGH_422;
    flvd_video_info_t picture{};
    FLVD_ParseVideoHeader(static_cast<int32_t>(video.codec), sets.data(), static_cast<int32_t>(sets.size()), &picture);
    return {picture.width, picture.height};
}

std::string AvcLevelName(flvdmx::Bytes record)
{
    return fmt::format("{}.{}", record[3] / 10, record[3] % 10);
}

} // namespace tool
