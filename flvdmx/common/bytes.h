// Big-endian fields and AMF0 numbers as an FLV file holds them. File bytes are never cast: a load at an odd address
// traps on some of the targets, while compilers turn these into a load and a byte swap.
#ifndef FLVDMX_COMMON_BYTES_H
#define FLVDMX_COMMON_BYTES_H

#include <cstdint>
#include <cstring>

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

// An AMF0 number: this marker and a big-endian IEEE 754 double.
constexpr uint8_t FLVD_AMF_NUMBER = 0;
constexpr uint32_t FLVD_AMF_NUMBER_SIZE = 8;

inline double FLVD_GetDouble(const uint8_t* p)
{
    static_assert(sizeof(double) == sizeof(uint64_t));
    const uint64_t bits = FLVD_GetBE64(p);
    double value = 0.0;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

// A number of the metadata as an unsigned field: towards zero, what does not fit is clamped, NaN is 0.
constexpr uint32_t FLVD_DoubleToU32(double value)
{
    constexpr double above = 4294967296.0; // 2^32
    if (!(value > 0.0))
        return 0;
    return value >= above ? UINT32_MAX : static_cast<uint32_t>(value);
}

// A number of the metadata as a file position: towards zero, what does not fit is clamped, NaN is 0.
constexpr int64_t FLVD_DoubleToI64(double value)
{
    constexpr double above = 9223372036854775808.0; // 2^63
    if (value >= above)
        return INT64_MAX;
    if (value < -above)
        return INT64_MIN;
    return value == value ? static_cast<int64_t>(value) : 0;
}

constexpr double FLVD_MS_PER_SECOND = 1000.0;

constexpr uint32_t FLVD_SecondsToMs(double seconds)
{
    return FLVD_DoubleToU32(seconds * FLVD_MS_PER_SECOND);
}

#endif
