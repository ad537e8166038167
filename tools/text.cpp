// Text for people.
#include "tools/text.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <limits>

#include <fmt/core.h>

namespace tool {

namespace {

constexpr int64_t MS_PER_SECOND = 1000;
constexpr int64_t SIXTY = 60;
constexpr int64_t MOST_SECONDS = std::numeric_limits<int32_t>::max() / MS_PER_SECOND + 1;

bool IsDigit(char c)
{
    return c >= '0' && c <= '9';
}

// Consumes the digits at the start of `text`: at least one, with a value that fits a time.
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

// Reads digits after the decimal point as milliseconds; the fourth digit rounds.
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

// Consumes `SECONDS` or `[HH:]MM:SS`; after a colon, only 0 to 59 are valid.
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

// Size of the UTF-8 character at the start of `text`; 0 if it is invalid or XML forbids it.
size_t CharacterSize(std::string_view text)
{
    const auto byte = [text](size_t i) { return i < text.size() ? static_cast<unsigned char>(text[i]) : 0U; };
    const uint32_t lead = byte(0);
    const size_t size = lead < 0x80 ? 1 : lead >> 5 == 6 ? 2 : lead >> 4 == 14 ? 3 : lead >> 3 == 30 ? 4 : 0;
    constexpr uint32_t LEAST[] = {0, 0, 0x80, 0x800, 0x10000};
    uint32_t value = size == 1 ? lead : lead & (0x7FU >> size);
    for (size_t i = 1; i < size; ++i) {
        if (byte(i) >> 6 != 2)
            return 0;
        value = value << 6 | (byte(i) & 0x3F);
    }
    const bool surrogate = value >> 11 == 0x1B;
    return value < LEAST[size] || value > 0x10FFFF || surrogate || value >> 1 == 0x7FFF ? 0 : size;
}

bool IsControl(std::string_view character)
{
    const auto first = static_cast<unsigned char>(character[0]);
    const bool c1 = character.size() == 2 && first == 0xC2 && static_cast<unsigned char>(character[1]) < 0xA0;
    return first < ' ' || first == 0x7F || c1;
}

// East Asian characters take two columns. Some that take one are counted as two, which only makes a line shorter.
size_t ColumnsOf(std::string_view text)
{
    size_t columns = 0;
    for (size_t i = 0, size = 0; i < text.size(); i += size) {
        size = std::max<size_t>(CharacterSize(text.substr(i)), 1);
        columns += size > 2 ? 2 : 1;
    }
    return columns;
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
    int64_t milliseconds = *seconds * MS_PER_SECOND;
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
    const int64_t size = milliseconds < 0 ? -milliseconds : milliseconds; // at most 33 bits
    const int64_t seconds = size / MS_PER_SECOND;
    return fmt::format("{}{}:{:02}:{:02}.{:03}", milliseconds < 0 ? "-" : "", seconds / SIXTY / SIXTY,
                       seconds / SIXTY % SIXTY, seconds % SIXTY, size % MS_PER_SECOND);
}

std::string Plural(uint64_t count, const char* noun)
{
    return fmt::format("{} {}{}", count, noun, count == 1 ? "" : "s");
}

std::string Number(double value, int decimals)
{
    constexpr double MOST = 1e18;
    if (!(std::abs(value) < MOST))
        return fmt::format("{:g}", value);
    const std::string text = fmt::format("{:.{}f}", value, decimals);
    const size_t last = text.find_last_not_of('0');
    return text.substr(0, text[last] == '.' ? last : last + 1);
}

std::string Hex(flvdmx::Bytes bytes)
{
    std::string text;
    for (const uint8_t byte : bytes)
        fmt::format_to(std::back_inserter(text), "{:02x}", byte);
    return text;
}

std::string Printable(std::string_view text)
{
    std::string printable;
    while (!text.empty()) {
        const std::string_view character = text.substr(0, std::max<size_t>(CharacterSize(text), 1));
        if (CharacterSize(text) != 0 && !IsControl(character))
            printable += character;
        else
            for (const char byte : character)
                fmt::format_to(std::back_inserter(printable), "\\x{:02x}", static_cast<unsigned char>(byte));
        text.remove_prefix(character.size());
    }
    return printable;
}

std::string Shorten(std::string_view printable, size_t columns)
{
    constexpr std::string_view ELLIPSIS = "...";
    if (ColumnsOf(printable) <= columns)
        return std::string(printable);
    const size_t room = columns - std::min(columns, ELLIPSIS.size());
    std::string_view head;
    std::string_view tail;
    for (size_t i = 0; ColumnsOf(printable.substr(0, i)) <= room / 2; i += CharacterSize(printable.substr(i)))
        head = printable.substr(0, i);
    for (size_t i = head.size(); i < printable.size() && tail.empty(); i += CharacterSize(printable.substr(i)))
        if (ColumnsOf(printable.substr(i)) <= room - room / 2)
            tail = printable.substr(i);
    return std::string(head) + std::string(ELLIPSIS.substr(0, columns)) + std::string(tail);
}

} // namespace tool
