// AAC frames as an audio data transport stream.
#include "tools/adts.h"

#include <fmt/core.h>

#include "tools/tags.h"

namespace tool {

namespace {

constexpr uint32_t HEADER_SIZE = 7;
constexpr uint32_t MOST_FRAME_BYTES = 0x1FFF; // 13 bits, header included
constexpr uint32_t MOST_OBJECT_TYPE = 4;      // 2 bits hold it less one
constexpr uint32_t ESCAPED_OBJECT_TYPE = 31;
constexpr uint32_t EXPLICIT_FREQUENCY = 15;
constexpr uint32_t FREQUENCIES = 13; // indices with a meaning

// The object type of an escape stands in the six bits behind it.
std::string ObjectTypeText(uint32_t objectType, uint32_t nextSix)
{
    const uint32_t number = objectType == ESCAPED_OBJECT_TYPE ? 32 + nextSix : objectType;
    return fmt::format("AAC of object type {} cannot be written as ADTS, which has types 1 to 4", number);
}

} // namespace

std::string Adts::Configure(const std::vector<uint8_t>& config)
{
    if (config.size() < 2)
        return "the AAC configuration is cut short";
    const uint32_t bits = BigEndian(config.data(), 2);
    const uint32_t objectType = bits >> 11;
    const uint32_t frequencyIndex = bits >> 7 & 0x0F;
    const uint32_t channels = bits >> 3 & 0x0F;
    if (objectType == 0 || objectType > MOST_OBJECT_TYPE)
        return ObjectTypeText(objectType, bits >> 5 & 0x3F);
    if (frequencyIndex == EXPLICIT_FREQUENCY)
        return "AAC with an explicit sampling frequency cannot be written as ADTS, which has a list of them";
    if (frequencyIndex >= FREQUENCIES)
        return fmt::format("the AAC configuration has the reserved sampling frequency index {}", frequencyIndex);
    if (channels == 0)
        return "AAC of channel configuration 0 cannot be written as ADTS, which has no room for a channel list";
    if (channels > 7)
        return fmt::format("AAC of channel configuration {} cannot be written as ADTS, which has 1 to 7", channels);
    m_profile = objectType - 1;
    m_frequencyIndex = frequencyIndex;
    m_channels = channels;
    return {};
}

// Syncword, MPEG-4, no checksum; a buffer fullness of all ones, for a variable rate; one raw data block.
bool Adts::Convert(const std::vector<uint8_t>& frame, std::vector<uint8_t>& out) const
{
    if (frame.empty())
        return true;
    if (frame.size() > MOST_FRAME_BYTES - HEADER_SIZE)
        return false;
    const uint32_t size = static_cast<uint32_t>(frame.size()) + HEADER_SIZE;
    const uint32_t firstFour = 0xFFF10000U | m_profile << 14 | m_frequencyIndex << 10 | m_channels << 6 | size >> 11;
    const uint32_t lastThree = (size << 13 & 0xFFFFFF) | 0x1FFC;
    for (const uint32_t shift : {24U, 16U, 8U, 0U})
        out.push_back(static_cast<uint8_t>(firstFour >> shift));
    for (const uint32_t shift : {16U, 8U, 0U})
        out.push_back(static_cast<uint8_t>(lastThree >> shift));
    out.insert(out.end(), frame.begin(), frame.end());
    return true;
}

} // namespace tool
