// Frames as streams that players take.
#ifndef FLVDMX_TOOLS_FORMATS_H
#define FLVDMX_TOOLS_FORMATS_H

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "tools/input.h"

namespace tool {

/** How the frames of a codec become a stream. */
class StreamFormat {
public:
    explicit StreamFormat(std::string extension) : m_extension(std::move(extension)) {}
    virtual ~StreamFormat() = default;
    StreamFormat(const StreamFormat&) = delete;
    StreamFormat& operator=(const StreamFormat&) = delete;

    const std::string& Extension() const { return m_extension; }

    /** Takes a codec configuration, valid for the frames after it. @return why that is not possible, the one before
     *  staying valid; empty when it is */
    virtual std::string Configure(flvdmx::Bytes config);

    /** @return what the stream begins with, when it has so many bytes of frames */
    virtual std::vector<uint8_t> Header(uint64_t bytes) const;

    /** Appends a frame to `out`. @return what was wrong with it, part of it being left out; null when nothing was */
    virtual const char* Convert(const flvdmx::Frame& frame, std::vector<uint8_t>& out);

    /** @return true when the frames are written as they are and no player takes them so */
    virtual bool IsRaw() const { return false; }

private:
    std::string m_extension;
};

/** @return true for a codec whose samples are not compressed */
constexpr bool IsPcm(flvdmx::AudioCodec codec)
{
    return codec == flvdmx::AudioCodec::pcm || codec == flvdmx::AudioCodec::pcm_little_endian;
}

/** @return bits per sample of an input with PCM audio */
uint32_t PcmSampleSize(const Input& input);

/** @return the format for a stream that the input has: AVC as Annex B, AAC as ADTS, PCM as WAV, MP3 as it is, all else
 *          raw */
std::unique_ptr<StreamFormat> FormatOf(const Input& input, flvdmx::Stream stream);

} // namespace tool

#endif
