// The tags of a file as they are there, for what playing does not tell: damage, and tags that are not played.
#ifndef FLVDMX_TOOLS_TAGS_H
#define FLVDMX_TOOLS_TAGS_H

#include <algorithm>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "flvdmx/layers.h"
#include "tools/input.h"

namespace tool {

constexpr uint32_t TAG_HEADER_SIZE = 11;
constexpr uint32_t BACK_POINTER_SIZE = 4;
constexpr uint32_t CODEC_ID_MASK = 0x0F;
constexpr uint8_t EXTENDED_HEADER = 0x80; /**< in the codec byte of enhanced FLV, before a FourCC */
constexpr uint32_t MOST_FRAME_TYPE = 5;   /**< FrameType of video */

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

    int64_t DataEnd() const { return position + TAG_HEADER_SIZE + size; }
    int64_t End() const { return DataEnd() + BACK_POINTER_SIZE; } /**< after the back-pointer */
    bool IsVideo() const { return type == FLVD_TAG_TYPE_VIDEO; }
    bool IsAudio() const { return type == FLVD_TAG_TYPE_AUDIO; }
    bool IsScript() const { return type == FLVD_TAG_TYPE_SCRIPT; }
    flvdmx::VideoCodec VideoCodec() const { return static_cast<flvdmx::VideoCodec>(codec & CODEC_ID_MASK); }
    flvdmx::AudioCodec AudioCodec() const { return static_cast<flvdmx::AudioCodec>(codec >> 4); }
    bool IsExtended() const { return IsVideo() && (codec & EXTENDED_HEADER) != 0; } /**< enhanced FLV */
    bool IsAvc() const { return IsVideo() && VideoCodec() == flvdmx::VideoCodec::avc; }
    bool IsAac() const { return IsAudio() && AudioCodec() == flvdmx::AudioCodec::aac; }
    flvdmx::Stream Stream() const { return IsVideo() ? flvdmx::Stream::video : flvdmx::Stream::audio; }
    uint32_t CodecHeaderSize() const { return IsAvc() ? 5 : IsAac() ? 2 : 1; } /**< bytes before the frame */
    bool IsConfig() const { return (IsAvc() || IsAac()) && packetType == 0; }
    bool IsFrame() const; /**< a tag that is played */
    bool IsKeyframe() const { return IsVideo() && IsFrame() && (codec >> 4 == 1 || codec >> 4 == 4); }
};

/** @return the tag at `position`, of which the first `available` bytes are given: at least a tag header */
Tag ParseTag(int64_t position, const uint8_t* bytes, uint32_t available);

/** Reads tags and numbers anywhere in a file, with a reader of its own. */
class TagReader {
public:
    /** @param input borrowed; it is played on meanwhile as if nothing happened */
    explicit TagReader(const Input& input);

    int64_t FileSize() const { return m_fileSize; }

    /** @return `size` bytes at `position`, valid until the next call; null when not all of them are there */
    const uint8_t* Bytes(int64_t position, uint32_t size);

    /** @return what stands at `position` when it has the type of a tag and is not cut in its header */
    std::optional<Tag> At(int64_t position);

    /**
     * Finds the first valid tag of the file's streams at or after `from`, however much damage is before it. One
     * search of the library covers a bounded stretch; the next follows while the reader advances before `end`.
     *
     * @param progress called with the place that each search without a tag has reached
     */
    std::optional<Tag> Find(int64_t from, int64_t end, const std::function<void(int64_t)>& progress = {});

    /** @return why a tag with nothing wrong about it is not played, such as "are too short for a frame"; empty when it
     *          is */
    std::string WhyNotPlayed(const Tag& tag);

    /** @return the first tag of a stream that begins too late for players to find it */
    std::optional<Tag> FirstIfLate(flvdmx::Stream stream);

    /** @return why no frame of that stream is delivered, from its first tag; empty when frames are, or when there is no
     *          such tag */
    const std::string& WhyNoStream(flvdmx::Stream stream);

private:
    std::string NameCodec(const Tag& tag);
    std::string ExtendedCodec(const Tag& tag);
    std::string ConfigFault(const Tag& tag);
    std::string FindReason(flvdmx::Stream stream);

    struct Numbered {
        std::optional<Tag> tag;
        int number; // of the tags before it
    };
    Numbered First(flvdmx::Stream stream);

    struct Closer {
        void operator()(fio_file_t* reader) const { __FLV_DMX__fioClose(reader); }
    };
    const Input& m_input;
    flvd_ctx_t* const m_instance;
    const std::unique_ptr<fio_file_t, Closer> m_reader;
    int64_t m_fileSize = 0;
    std::optional<std::string> m_noVideo; // the reasons, once they were sought
    std::optional<std::string> m_noAudio;
};

/** Tells on standard error which of these streams (FLVD_STREAM_* bits) the file has but are not played, and why. */
void WarnOfUnplayed(const Input& input, uint32_t streams = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO);

/** @return name and CodecID of a video codec */
std::string VideoCodecName(flvdmx::VideoCodec codec);

/** Watches for bytes that are left out between the frames of a file. */
class Losses {
public:
    /** @param input borrowed
     *  @param script called with each script tag between frames; may be empty */
    explicit Losses(const Input& input, std::function<void(const Tag&)> script = {});

    /** Takes every frame of the file, in file order. @return true when bytes were left out before it */
    bool Take(const flvdmx::Frame& frame);
    /** After the last frame. */
    void Finish() { Inspect(m_end, m_input.Instance().data_end); }

    int64_t Bytes() const { return m_bytes; } /**< left out so far */
    /** @return bytes after the last frame and the end of the valid data */
    int64_t Rest() const
    {
        return std::max(m_input.info.size - std::max(m_end, m_input.Instance().data_end), int64_t{0});
    }
    /** Tells on standard error what was left out. */
    void Warn() const;

private:
    int64_t EndOf(const flvdmx::Frame& frame);
    void Inspect(int64_t from, int64_t to);
    void Lose(int64_t from, int64_t to);

    const Input& m_input;
    const std::function<void(const Tag&)> m_script;
    TagReader m_reader;
    int64_t m_end;
    int64_t m_bytes = 0;
    int64_t m_first = 0;
    std::string m_why; // of the first tag that is valid and left out
};

} // namespace tool

#endif
