// A single tag: its header, its codec, and why its stream may not be played.
#ifndef FLVDMX_TOOLS_TAG_H
#define FLVDMX_TOOLS_TAG_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "flvdmx/flvdmx.hpp"

namespace tool {

constexpr uint32_t TAG_HEADER_SIZE = 11;
constexpr uint32_t BACK_POINTER_SIZE = 4;
constexpr uint32_t CODEC_ID_MASK = 0x0F;
constexpr uint8_t EXTENDED_HEADER = 0x80; /**< in the codec byte of enhanced FLV, before a FourCC */
constexpr uint32_t FOURCC_SIZE = 4;
constexpr uint32_t MOST_FRAME_TYPE = 5;  /**< FrameType of video */
constexpr uint32_t MOST_SET_BYTES = 128; /**< of AVC parameter sets, for which the library has room */

/** @return the number in the `size` bytes at `bytes`, most significant first */
uint32_t BigEndian(const uint8_t* bytes, uint32_t size);

/** A tag header and the first two payload bytes, 0 where the payload is shorter. */
struct Tag {
    int64_t position;
    uint32_t type; /**< FLVD_TAG_TYPE_* */
    uint32_t size; /**< payload bytes */
    uint32_t timestamp;
    uint32_t streamId;
    uint8_t codec;
    uint8_t packetType;

    /** Reads a header of TAG_HEADER_SIZE bytes, and up to two bytes after it if they are available. */
    static Tag Parse(int64_t position, const uint8_t* bytes, size_t available);

    int64_t DataEnd() const { return position + TAG_HEADER_SIZE + size; }
    int64_t End() const { return DataEnd() + BACK_POINTER_SIZE; } /**< after the back-pointer */
    bool HasKnownType() const { return IsVideo() || IsAudio() || IsScript(); }
    bool IsVideo() const { return type == FLVD_TAG_TYPE_VIDEO; }
    bool IsAudio() const { return type == FLVD_TAG_TYPE_AUDIO; }
    bool IsScript() const { return type == FLVD_TAG_TYPE_SCRIPT; }
    flvdmx::VideoCodec VideoCodec() const { return static_cast<flvdmx::VideoCodec>(codec & CODEC_ID_MASK); }
    flvdmx::AudioCodec AudioCodec() const { return static_cast<flvdmx::AudioCodec>(codec >> 4); }
    bool IsExtended() const { return IsVideo() && (codec & EXTENDED_HEADER) != 0; } /**< enhanced FLV, or damaged */
    bool IsAvc() const { return IsVideo() && VideoCodec() == flvdmx::VideoCodec::avc; }
    bool IsAac() const { return IsAudio() && AudioCodec() == flvdmx::AudioCodec::aac; }
    flvdmx::Stream Stream() const { return IsVideo() ? flvdmx::Stream::video : flvdmx::Stream::audio; }
    uint32_t CodecHeaderSize() const { return IsAvc() ? 5 : IsAac() ? 2 : 1; } /**< bytes before the frame */
    bool IsConfig() const { return (IsAvc() || IsAac()) && packetType == 0; }
    bool IsFrame() const; /**< a tag that is played */
    bool IsKeyframe() const { return IsVideo() && IsFrame() && (codec >> 4 == 1 || codec >> 4 == 4); }
};

/** @return name of a video codec, with the CodecID of one that FLV does not define */
std::string CodecName(flvdmx::VideoCodec codec);
/** @return the same for audio */
std::string CodecName(flvdmx::AudioCodec codec);

/** @return true for a tag of enhanced FLV. @param fourcc the FOURCC_SIZE bytes after the codec byte */
bool IsEnhanced(const Tag& tag, std::string_view fourcc);

/** @return name of the codec of a video or audio tag. @param fourcc as above */
std::string CodecOf(const Tag& tag, std::string_view fourcc);

/** @return why no frame of a stream without playable frames is delivered, such as "it is enhanced FLV", judging by its
 *          first tag near the beginning of the file; empty if there is none */
std::string WhyNoStream(const std::string& path, flvdmx::Stream stream);

/** @return why a file that the library rejected with this code cannot be played; empty if unknown */
std::string WhyNothingIsPlayed(const std::string& path, int32_t code);

} // namespace tool

#endif
