// Loads the big-endian fields of an FLV file byte by byte. File bytes are never cast: an unaligned load traps on some
// targets, and where it does not, compilers turn these functions into a load and a byte swap.
#ifndef FLVDMX_COMMON_BYTES_H
#define FLVDMX_COMMON_BYTES_H

#include <cstdint>

[[gnu::always_inline]] constexpr uint32_t FLVD_GetBE16(const uint8_t* p)
{
    return uint32_t{p[0]} << 8 | p[1];
}

[[gnu::always_inline]] constexpr uint32_t FLVD_GetBE24(const uint8_t* p)
{
    return uint32_t{p[0]} << 16 | uint32_t{p[1]} << 8 | p[2];
}

[[gnu::always_inline]] constexpr uint32_t FLVD_GetBE32(const uint8_t* p)
{
    return uint32_t{p[0]} << 24 | uint32_t{p[1]} << 16 | uint32_t{p[2]} << 8 | p[3];
}

[[gnu::always_inline]] constexpr uint64_t FLVD_GetBE64(const uint8_t* p)
{
    return uint64_t{FLVD_GetBE32(p)} << 32 | FLVD_GetBE32(p + 4);
}

#endif
