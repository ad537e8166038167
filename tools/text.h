// Text for people: times, numbers, and names that may contain any bytes.
#ifndef FLVDMX_TOOLS_TEXT_H
#define FLVDMX_TOOLS_TEXT_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "flvdmx/flvdmx.hpp"

namespace tool {

/**
 * Reads `SECONDS[.FRACTION]` or `[HH:]MM:SS[.FRACTION]`, either after spaces and a sign.
 *
 * @return milliseconds, rounded to the nearest; nothing when the text is not a time or does not fit 32 bits
 */
std::optional<int32_t> ParseTime(std::string_view text);

/** @return the time as `H:MM:SS.mmm`, after a minus if it is negative */
std::string FormatTime(int64_t milliseconds);

/** The same. */
inline std::string FormatTime(flvdmx::Milliseconds time)
{
    return FormatTime(time.count());
}

/** @return `1 frame`, `2 frames` */
std::string Plural(uint64_t count, const char* noun);

/** @return the number with at most `decimals` decimals (1 or more) and no trailing zeros; with an exponent only from
 * 1e18 on */
std::string Number(double value, int decimals = 3);

/** @return the bytes as hexadecimal digits */
std::string Hex(flvdmx::Bytes bytes);

/** @return the text as valid UTF-8 for a terminal or a drawing; the bytes of control characters and invalid sequences
 *          become \xNN */
std::string Printable(std::string_view text);

/** @return a printable text that fits into that many columns, its middle replaced by "..." if needed */
std::string Shorten(std::string_view printable, size_t columns);

} // namespace tool

#endif
