// CRC-32 as in Ethernet, gzip and PNG (ISO/IEC 8802-3): reflected polynomial 0xEDB88320.
#ifndef FLVDMX_TOOLS_CRC32_H
#define FLVDMX_TOOLS_CRC32_H

#include <array>
#include <cstddef>
#include <cstdint>

namespace tool {

constexpr std::array<uint32_t, 256> MakeCrc32Table()
{
    std::array<uint32_t, 256> table{};
    for (uint32_t byte = 0; byte < table.size(); ++byte) {
        uint32_t crc = byte;
        for (int bit = 0; bit < 8; ++bit)
            crc = (crc & 1) != 0 ? crc >> 1 ^ 0xEDB88320U : crc >> 1;
        table[byte] = crc;
    }
    return table;
}

constexpr std::array<uint32_t, 256> CRC32_TABLE = MakeCrc32Table();
static_assert(CRC32_TABLE[1] == 0x77073096U && CRC32_TABLE[255] == 0x2D02EF8DU, "the published table");

inline uint32_t Crc32(const uint8_t* data, size_t size)
{
    uint32_t crc = 0xFFFFFFFFU;
    for (size_t i = 0; i < size; ++i)
        crc = crc >> 8 ^ CRC32_TABLE[(crc ^ data[i]) & 0xFF];
    return ~crc;
}

} // namespace tool

#endif
