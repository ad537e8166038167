// What all commands print: text for people, documents, errors and warnings.
#ifndef FLVDMX_TOOLS_REPORT_H
#define FLVDMX_TOOLS_REPORT_H

#include <array>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "flvdmx/flvdmx.hpp"

namespace tool {

using Json = nlohmann::ordered_json;

/** Ends the work on a file; what() returns the reason, without the file's name. */
class FileError : public std::runtime_error {
public:
    FileError(const std::string& file, const std::string& text, const flvdmx::error& error = {})
        : std::runtime_error(text), m_file(file), m_error(error)
    {
    }
    /** Uses the library's text for the failure. */
    FileError(const std::string& file, const flvdmx::error& error) : FileError(file, error.text(), error) {}

    const std::string& File() const { return m_file; } /**< as the user named it */
    const flvdmx::error& Cause() const
    {
        return m_error;
    }                    /**< the library's failure; Kind::none if it is not the library's */
    Json Object() const; /**< message, code and line */

private:
    std::string m_file;
    flvdmx::error m_error;
};

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

/** From now on, messages include the library's error code and line number. */
void ShowCodes();

/** Writes to standard output; throws std::system_error on failure, for instance when the reader has closed the pipe. */
void Print(std::string_view text);

/** Flushes standard output; throws as Print does. */
void Flush();

/** Prints the document and a line end. */
void PrintJson(const Json& document, int indent = -1);

constexpr const char* STANDARD_STREAM = "-"; /**< names standard input or standard output */

/** @return the printable name of an input file */
std::string DisplayName(const std::string& file);

/** Writes `flvdmx: FILE: TEXT` to standard error. */
void Complain(const std::string& file, std::string_view text);

/** Writes the error to standard error. */
void Complain(const FileError& error);

/** Writes to standard error. A failure is ignored: there is nowhere to report it. */
void Tell(const std::string& text);

inline constexpr std::array STREAMS = {flvdmx::Stream::video, flvdmx::Stream::audio};

/** @return the index in STREAMS, and in arrays with an element per stream */
constexpr size_t IndexOf(flvdmx::Stream stream)
{
    return stream == flvdmx::Stream::video ? 0 : 1;
}

/** @return "video" or "audio" */
const char* StreamName(flvdmx::Stream stream);

} // namespace tool

#endif
