// Times as the user writes and reads them.
#ifndef FLVDMX_TOOLS_TIME_TEXT_H
#define FLVDMX_TOOLS_TIME_TEXT_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tool {

/**
 * Reads `SECONDS[.FRACTION]` or `[HH:]MM:SS[.FRACTION]`, either with a sign and blanks in front.
 *
 * @return milliseconds, rounded to the nearest; nothing when the text is no time or does not fit 32 bits
 */
std::optional<int32_t> ParseTime(std::string_view text);

/** @return the time as `H:MM:SS.mmm`, with a minus in front of a negative one */
std::string FormatTime(int64_t milliseconds);

} // namespace tool

#endif
