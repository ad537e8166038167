// Reads bits from memory, most significant bit first. Bits past the end read as 0, so that parsers of short or damaged
// headers need no checks of their own. It is for headers, where simplicity counts more than speed.
#ifndef FLVDMX_CODEC_BIT_STREAM_H
#define FLVDMX_CODEC_BIT_STREAM_H

#include <cstdint>

class FLVD_BitStream {
public:
    FLVD_BitStream(const uint8_t* data, uint32_t size) : m_data(data), m_size(size) {}

    // n is at most 32.
    uint32_t Get(uint32_t n)
    {
        uint32_t value = 0;
        for (; n != 0; --n)
            value = value << 1u | GetBit();
        return value;
    }

    void Skip(uint32_t n) { m_bit += n; }

private:
    uint32_t GetBit()
    {
        const uint32_t byte = m_bit / 8;
        const uint32_t bit = byte < m_size ? m_data[byte] >> (7 - m_bit % 8) & 1u : 0u;
        ++m_bit;
        return bit;
    }

    const uint8_t* const m_data;
    const uint32_t m_size;
    uint32_t m_bit = 0;
};

#endif
