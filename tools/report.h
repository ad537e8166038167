// What all subcommands print: documents, errors and warnings.
#ifndef FLVDMX_TOOLS_REPORT_H
#define FLVDMX_TOOLS_REPORT_H

#include <stdexcept>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "flvdmx/flvdmx.hpp"

namespace tool {

using Json = nlohmann::ordered_json;

/** Ends the work on a file; what() says why in words, without the file's name. */
class FileError : public std::runtime_error {
public:
    FileError(const std::string& file, const std::string& text, const flvdmx::error& error = {})
        : std::runtime_error(text), m_file(file), m_error(error)
    {
    }
    /** The library's failure in its own words. */
    FileError(const std::string& file, const flvdmx::error& error) : FileError(file, error.text(), error) {}

    const std::string& File() const { return m_file; }     /**< as the user named it */
    const flvdmx::error& Cause() const { return m_error; } /**< the library's failure; of Kind::none without one */
    Json Object() const;                                   /**< message, code and line */

private:
    std::string m_file;
    flvdmx::error m_error;
};

/** From now on messages tell the library's code and line as well. */
void ShowCodes();

/** Writes to standard output; throws std::system_error when it cannot, as to a pipe that nobody reads any more. */
void Print(std::string_view text);

/** Hands on at once what was written; throws as Print does. */
void Flush();

/** Writes the document and a line end. */
void PrintJson(const Json& document, int indent = -1);

/** Writes `flvdmx: FILE: TEXT` to standard error. */
void Complain(const std::string& file, std::string_view text);

/** Writes the error to standard error. */
void Complain(const FileError& error);

/** Writes to standard error; when that fails there is nobody to tell. */
void Tell(const std::string& text);

/** @return "video" or "audio" */
const char* StreamName(flvdmx::Stream stream);

} // namespace tool

#endif
