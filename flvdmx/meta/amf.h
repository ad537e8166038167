// AMF0 as script data uses it ("Action Message Format, AMF 0"): type markers and numbers.
#ifndef FLVDMX_META_AMF_H
#define FLVDMX_META_AMF_H

#include "flvdmx/common/bytes.h"

#include <cstring>

// Markers of the values that are parsed. Every other marker counts as a value without content.
enum : uint32_t {
    FLVD_AMF_NUMBER = 0,
    FLVD_AMF_BOOLEAN = 1,
    FLVD_AMF_STRING = 2,
    FLVD_AMF_OBJECT = 3,
    FLVD_AMF_MOVIE_CLIP = 4,
    FLVD_AMF_REFERENCE = 7,
    FLVD_AMF_ECMA_ARRAY = 8,
    FLVD_AMF_STRICT_ARRAY = 10,
    FLVD_AMF_DATE = 11,
    FLVD_AMF_LONG_STRING = 12
};

constexpr uint32_t FLVD_AMF_NUMBER_SIZE = 8; // a big-endian IEEE 754 double

inline double FLVD_GetDouble(const uint8_t* p)
{
    static_assert(sizeof(double) == sizeof(uint64_t));
    const uint64_t bits = FLVD_GetBE64(p);
    double value = 0.0;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

// Converts a number of the metadata to an unsigned field: truncates, clamps to the range, maps NaN to 0.
constexpr uint32_t FLVD_DoubleToU32(double value)
{
    constexpr double above = 4294967296.0; // 2^32
    if (!(value > 0.0))
        return 0;
    return value >= above ? UINT32_MAX : static_cast<uint32_t>(value);
}

// Converts a number of the metadata to a file position: truncates, clamps to the range, maps NaN to 0.
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
