// What all subcommands print: frames, JSON documents, errors and warnings.
#ifndef FLVDMX_TOOLS_REPORT_H
#define FLVDMX_TOOLS_REPORT_H

#include <cstdint>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "tools/demuxer.h"
#include "tools/tags.h"

namespace tool {

using Json = nlohmann::ordered_json;

/** Writes to standard output; throws std::system_error when it cannot, as for a pipe that nobody reads any more. */
void Print(std::string_view text);

/** Hands on at once what was written; throws as Print does. */
void Flush();

/** Writes the document and a line end. */
void PrintJson(const Json& document, int indent = -1);

/** Writes `flvdmx: FILE: TEXT` to standard error. */
void Complain(const std::string& file, std::string_view text);

/** Writes to standard error; when that fails there is nobody to tell. */
void Tell(const std::string& text);

/** Tells on standard error what of a complete file will not be played. */
void WarnIfCutShort(const Demuxer& demuxer);

/** Tells on standard error what a reader at its end has passed over. */
void WarnOfSkipped(const Demuxer& demuxer, const TagReader& reader);

/** @return message, code and line as an object */
Json ErrorObject(const DemuxError& error);

/** @return "video" or "audio" */
const char* StreamName(uint32_t stream);

/** @return one line: number, stream, time, size in bytes, CRC-32 */
std::string FrameLine(uint64_t number, const Frame& frame);

/** @return the same as an object: number, stream, time_ms, size, crc32 */
Json FrameObject(uint64_t number, const Frame& frame);

} // namespace tool

#endif
