// Times as the user writes and reads them.
#include "tools/time_text.h"

#include <algorithm>
#include <limits>

#include <fmt/core.h>

namespace tool {

namespace {

constexpr int64_t MILLISECONDS_A_SECOND = 1000;
constexpr int64_t SIXTY = 60;
constexpr int64_t MOST_SECONDS = std::numeric_limits<int32_t>::max() / MILLISECONDS_A_SECOND + 1;

bool IsDigit(char c)
{
    return c >= '0' && c <= '9';
}

// Takes the digits at the front of `text`: at least one, of a value that can still be a time.
std::optional<int64_t> TakeNumber(std::string_view& text)
{
    int64_t value = 0;
    size_t length = 0;
    while (length < text.size() && IsDigit(text[length])) {
        value = value * 10 + (text[length++] - '0');
        if (value > MOST_SECONDS)
            return std::nullopt;
    }
    text.remove_prefix(length);
    return length > 0 ? std::optional(value) : std::nullopt;
}

// Reads digits behind the decimal point as milliseconds; the fourth digit rounds.
std::optional<int64_t> ParseFraction(std::string_view digits)
{
    if (digits.empty())
        return std::nullopt;
    int64_t tenths = 0; // of a millisecond
    for (size_t i = 0; i < 4; ++i)
        tenths = tenths * 10 + (i < digits.size() && IsDigit(digits[i]) ? digits[i] - '0' : 0);
    for (const char c : digits) {
        if (!IsDigit(c))
            return std::nullopt;
    }
    return (tenths + 5) / 10;
}

// Takes `SECONDS` or `[HH:]MM:SS`; behind a colon only 0 to 59 make sense.
std::optional<int64_t> TakeSeconds(std::string_view& text)
{
    std::optional<int64_t> seconds = TakeNumber(text);
    for (int colons = 0; seconds && !text.empty() && text.front() == ':'; ++colons) {
        text.remove_prefix(1);
        const std::optional<int64_t> part = TakeNumber(text);
        if (!part || *part >= SIXTY || colons == 2)
            return std::nullopt;
        seconds = *seconds * SIXTY + *part;
    }
    return seconds;
}

} // namespace

std::optional<int32_t> ParseTime(std::string_view text)
{
    text.remove_prefix(std::min(text.find_first_not_of(' '), text.size()));
    const bool negative = !text.empty() && text.front() == '-';
    if (negative || (!text.empty() && text.front() == '+'))
        text.remove_prefix(1);
    const std::optional<int64_t> seconds = TakeSeconds(text);
    if (!seconds)
        return std::nullopt;
    int64_t milliseconds = *seconds * MILLISECONDS_A_SECOND;
    if (!text.empty()) {
        const std::optional<int64_t> fraction = text.front() == '.' ? ParseFraction(text.substr(1)) : std::nullopt;
        if (!fraction)
            return std::nullopt;
        milliseconds += *fraction;
    }
    if (milliseconds > std::numeric_limits<int32_t>::max())
        return std::nullopt;
    return static_cast<int32_t>(negative ? -milliseconds : milliseconds);
}

std::string FormatTime(int64_t milliseconds)
{
    const int64_t size = milliseconds < 0 ? -milliseconds : milliseconds; // far from the limits: 33 bits
    const int64_t seconds = size / MILLISECONDS_A_SECOND;
    return fmt::format("{}{}:{:02}:{:02}.{:03}", milliseconds < 0 ? "-" : "", seconds / SIXTY / SIXTY,
                       seconds / SIXTY % SIXTY, seconds % SIXTY, size % MILLISECONDS_A_SECOND);
}

} // namespace tool
