// Frames as streams that players accept.
#ifndef FLVDMX_TOOLS_FORMATS_H
#define FLVDMX_TOOLS_FORMATS_H

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "tools/input.h"

namespace tool {

/** Turns the frames of a codec into a stream. */
class StreamFormat {
public:
    explicit StreamFormat(std::string extension) : m_extension(std::move(extension)) {}
    virtual ~StreamFormat() = default;
    StreamFormat(const StreamFormat&) = delete;
    StreamFormat& operator=(const StreamFormat&) = delete;

    const std::string& Extension() const { return m_extension; }

    /** Sets the codec configuration of the frames that follow. @return why it was rejected, in which case the previous
     *  one stays in use; empty on success */
    virtual std::string Configure(flvdmx::Bytes config);

    /** @return the header of a stream whose frames have this many bytes */
    virtual std::vector<uint8_t> Header(uint64_t bytes) const;

    /** Appends a frame to `out`. @return what part of it had to be skipped; null if none */
    virtual const char* Convert(const flvdmx::Frame& frame, std::vector<uint8_t>& out);

    /** @return true if the bare frames are written, which no player accepts */
    virtual bool IsRaw() const { return false; }

private:
    std::string m_extension;
};

/** @return the format for a stream of the input: AVC as Annex B, AAC as ADTS, PCM as WAV, MP3 unchanged, others raw */
std::unique_ptr<StreamFormat> FormatOf(const Input& input, flvdmx::Stream stream);

} // namespace tool

#endif
