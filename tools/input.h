// A file that is read: opened with words for what goes wrong.
#ifndef FLVDMX_TOOLS_INPUT_H
#define FLVDMX_TOOLS_INPUT_H

#include <cstdint>
#include <string>

#include "flvdmx/flvdmx.hpp"

namespace tool {

constexpr const char* STANDARD_STREAM = "-";          /**< names standard input or standard output */
constexpr uint64_t STANDARD_INPUT_MAX = 256ULL << 20; /**< bytes taken from a pipe */

/** @return the functions with which all files are read */
const flvdmx::Host& Host();

/** @return the path to open for what the user named; for "-" one of what standard input holds. Throws FileError for
 * what cannot be read at any place */
std::string PathOf(const std::string& name);

/** @return true when the file begins as FLV files do */
bool HasSignature(const std::string& path);

/** An open file. */
struct Input {
    /** Opens the file; throws FileError. */
    explicit Input(const std::string& file, const flvdmx::Options& options = {});
    Input(const std::string& file, flvdmx::File&& opened);

    std::string name; /**< as the user wrote it */
    flvdmx::File file;
    flvdmx::Info info;

    const flvd_ctx_t& Instance() const { return *file.instance(); }
    uint32_t Streams() const; /**< FLVD_STREAM_* bits of the streams found */
    bool Has(flvdmx::Stream stream) const { return (Streams() & static_cast<uint32_t>(stream)) != 0; }

    /** Bytes after the last whole tag of a complete file. */
    int64_t Rest() const;

    /** Tells on standard error what of a complete file cannot be played because its end is missing. */
    void WarnIfCutShort() const;
};

/** @return what to tell of a file that could not be opened */
std::string OpenFailureText(const std::string& path, const flvdmx::error& error);

} // namespace tool

#endif
