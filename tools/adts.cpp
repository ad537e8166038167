// AAC frames as an audio data transport stream.
#include "tools/adts.h"

#include <fmt/core.h>

namespace tool {

namespace {

constexpr uint32_t HEADER_SIZE = 7;
constexpr uint32_t MOST_FRAME_BYTES = 0x1FFF; // 13 bits, header included
constexpr uint32_t MOST_OBJECT_TYPE = 4;      // 2 bits hold it less one
constexpr uint32_t ESCAPED_OBJECT_TYPE = 31;
constexpr uint32_t EXPLICIT_FREQUENCY = 15;
constexpr uint32_t FREQUENCIES = 13; // indices with a meaning

constexpr uint32_t SBR_OBJECT_TYPE = 5; // HE-AAC: the core's own type follows
constexpr uint32_t PS_OBJECT_TYPE = 29; // HE-AAC version 2, likewise

// The configuration as a row of bits; those behind its end are 0.
class Bits {
public:
    explicit Bits(const std::vector<uint8_t>& bytes) : m_bytes(bytes) {}

    uint32_t Take(uint32_t count)
    {
        uint32_t value = 0;
        for (; count > 0; --count, ++m_taken) {
            const size_t byte = m_taken / 8;
            value = value << 1 | (byte < m_bytes.size() ? uint32_t{m_bytes[byte]} >> (7 - m_taken % 8) & 1U : 0U);
        }
        return value;
    }
    uint32_t TakeObjectType()
    {
        const uint32_t objectType = Take(5);
        return objectType == ESCAPED_OBJECT_TYPE ? 32 + Take(6) : objectType;
    }
    bool AreShort() const { return m_taken > m_bytes.size() * 8; }

private:
    const std::vector<uint8_t>& m_bytes;
    size_t m_taken = 0;
};

// Passes the output rate of HE-AAC. @return the core's object type, which a decoder needs no more than that
uint32_t TakeCore(Bits& bits)
{
    constexpr uint32_t EXPLICIT_BITS = 24;
    if (bits.Take(4) == EXPLICIT_FREQUENCY)
        bits.Take(EXPLICIT_BITS);
    return bits.TakeObjectType();
}

} // namespace

std::string Adts::Configure(const std::vector<uint8_t>& config)
{
    Bits bits(config);
    uint32_t objectType = bits.TakeObjectType();
    const uint32_t frequencyIndex = bits.Take(4);
    const uint32_t channels = bits.Take(4);
    if (frequencyIndex == EXPLICIT_FREQUENCY)
        return "AAC with an explicit sampling frequency cannot be written as ADTS, which has a list of them";
    if (objectType == SBR_OBJECT_TYPE || objectType == PS_OBJECT_TYPE)
        objectType = TakeCore(bits);
    if (bits.AreShort())
        return "the AAC configuration is cut short";
    if (objectType == 0 || objectType > MOST_OBJECT_TYPE)
        return fmt::format("AAC of object type {} cannot be written as ADTS, which has types 1 to 4", objectType);
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
