// A file to read.
#ifndef FLVDMX_TOOLS_INPUT_H
#define FLVDMX_TOOLS_INPUT_H

#include <cstdint>
#include <string>

#include "flvdmx/flvdmx.hpp"
#include "tools/report.h"

namespace tool {

constexpr uint64_t STANDARD_INPUT_MAX = 256ULL << 20; /**< bytes read from a pipe */

/** @return the host functions that read all files */
const flvdmx::Host& Host();

/** @return the path of the file that the user named; for "-", the path of standard input or of a copy of it. Throws
 *          FileError for a file that is not seekable */
std::string PathOf(const std::string& name);

/** @return true if the file starts with the signature of FLV files */
bool HasSignature(const std::string& path);

/** An open file. */
struct Input {
    /** Opens the file; throws FileError. */
    explicit Input(const std::string& file, const flvdmx::Options& options = {});
    Input(const std::string& file, flvdmx::File&& opened);

    std::string name; /**< as the user wrote it */
    flvdmx::File file;
    flvdmx::Info info;
    uint8_t audioFormat = 0; /**< the codec byte of audio tags: SoundFormat, SoundRate, SoundSize, SoundType */

    const flvd_ctx_t& Instance() const { return *file.instance(); }
    uint32_t Streams() const; /**< FLVD_STREAM_* bits of the streams found */
    bool Has(flvdmx::Stream stream) const { return (Streams() & static_cast<uint32_t>(stream)) != 0; }

    /** @return the time of a tag in ms, counted from the file's first timestamp; may be negative */
    int64_t TimeOf(const flvdmx::Tag& tag) const { return int64_t{tag.timestamp()} - info.start_time.count(); }

    /** @return bits per sample of PCM audio, by that byte */
    uint32_t PcmSampleSize() const { return (audioFormat & 2) != 0 ? 16 : 8; }

    /** Seeks as File::seek() does, but from tag to tag if the keyframe index turns out to be wrong, with a warning. */
    flvdmx::result<flvdmx::Milliseconds> Seek(flvdmx::Milliseconds time, flvdmx::SeekMode mode);

    /** Seeks to the keyframe at or before a time; throws FileError if the time is after the last frame.
     *  @return the time reached; Kind::failed */
    flvdmx::result<flvdmx::Milliseconds> SeekToStart(int32_t ms);

    /** @return the number of bytes after the last complete tag; 0 for a growing file */
    int64_t Rest() const;

    /** Warns on standard error if a complete file is cut short. */
    void WarnIfCutShort() const;
};

/** @return why a file could not be opened, as text */
std::string OpenFailureText(const std::string& name, const flvdmx::error& error);

} // namespace tool

#endif
