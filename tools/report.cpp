// What all commands print.
#include "tools/report.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <iterator>
#include <limits>
#include <regex>
#include <system_error>

#include <boost/nowide/utf/utf.hpp>
#include <fmt/core.h>

namespace tool {

namespace {

constexpr int64_t MS_PER_SECOND = 1000;
constexpr int64_t SIXTY = 60;

// Size of the UTF-8 character at the start of `text`; 0 if it is invalid or XML forbids it.
size_t CharacterSize(std::string_view text)
{
    constexpr uint32_t FORBIDDEN = 0xFFFE; // and 0xFFFF
    const char* end = text.data();
    const auto code = boost::nowide::utf::utf_traits<char>::decode(end, text.data() + text.size());
    const bool valid = boost::nowide::utf::is_valid_codepoint(code) && code >> 1 != FORBIDDEN >> 1;
    return valid ? static_cast<size_t>(end - text.data()) : 0;
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

bool g_showsCodes = false;

} // namespace

std::optional<int32_t> ParseTime(std::string_view text)
{
    static const std::regex FORMAT(R"( {0,9}([-+]?)(?:(?:(\d{1,9}):)?(\d{1,9}):)?(\d{1,9})(\.\d{1,20})?)");
    enum : size_t { SIGN = 1, HOURS, MINUTES, SECONDS, FRACTION };
    std::cmatch parts;
    if (!std::regex_match(text.data(), text.data() + text.size(), parts, FORMAT))
        return std::nullopt;
    const auto number = [&parts](size_t part) { return parts[part].matched ? std::stoll(parts[part]) : 0; };
    if ((parts[HOURS].matched && number(MINUTES) >= SIXTY) || (parts[MINUTES].matched && number(SECONDS) >= SIXTY))
        return std::nullopt;
    const int64_t seconds = (number(HOURS) * SIXTY + number(MINUTES)) * SIXTY + number(SECONDS);
    const double fraction = parts[FRACTION].matched ? std::stod("0" + parts[FRACTION].str()) : 0;
    const int64_t milliseconds = seconds * MS_PER_SECOND + std::llround(fraction * MS_PER_SECOND);
    if (milliseconds > std::numeric_limits<int32_t>::max())
        return std::nullopt;
    return static_cast<int32_t>(parts[SIGN] == "-" ? -milliseconds : milliseconds);
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

void ShowCodes()
{
    g_showsCodes = true;
}

Json FileError::Object() const
{
    return {{"message", what()}, {"code", m_error.code()}, {"line", m_error.line()}};
}

void Print(std::string_view text)
{
    if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size())
        throw std::system_error(errno, std::generic_category());
}

void Flush()
{
    if (std::fflush(stdout) != 0)
        throw std::system_error(errno, std::generic_category());
}

void PrintJson(const Json& document, int indent)
{
    // A file name may be invalid UTF-8; a JSON document must not.
    Print(document.dump(indent, ' ', false, Json::error_handler_t::replace) + "\n");
}

void Tell(const std::string& text)
{
    std::fputs(text.c_str(), stderr);
}

std::string DisplayName(const std::string& file)
{
    return file == STANDARD_STREAM ? "standard input" : Printable(file);
}

void Complain(const std::string& file, std::string_view text)
{
    std::fflush(stdout); // keeps the order of output and messages on a terminal
    Tell(fmt::format("flvdmx: {}: {}\n", DisplayName(file), text));
}

void Complain(const FileError& error)
{
    const flvdmx::error& cause = error.Cause();
    const bool coded = g_showsCodes && cause.kind() != flvdmx::Kind::none;
    Complain(error.File(),
             error.what() + (coded ? fmt::format(" (code {}, line {})", cause.code(), cause.line()) : ""));
}

const char* StreamName(flvdmx::Stream stream)
{
    return stream == flvdmx::Stream::video ? "video" : "audio";
}

} // namespace tool
