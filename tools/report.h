// What all commands print: documents, errors and warnings.
#ifndef FLVDMX_TOOLS_REPORT_H
#define FLVDMX_TOOLS_REPORT_H

#include <array>
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

/** @return "video" or "audio" */
const char* StreamName(flvdmx::Stream stream);

} // namespace tool

#endif
