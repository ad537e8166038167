// The tags of an open file one after the other, as they are played, with their payload.
#ifndef FLVDMX_TOOLS_TAGS_H
#define FLVDMX_TOOLS_TAGS_H

#include <cstdint>
#include <functional>
#include <optional>
#include <vector>

#include "tools/demuxer.h"

namespace tool {

constexpr uint32_t TAG_HEADER_SIZE = 11;
constexpr uint32_t BACK_POINTER_SIZE = 4;
constexpr uint32_t CODEC_ID_MASK = 0x0F;
constexpr uint32_t MOST_FRAME_TYPE = 5;   /**< FrameType of video */
constexpr uint32_t CODEC_ID_AVC = 7;      /**< CodecID of video */
constexpr uint32_t SOUND_FORMAT_AAC = 10; /**< SoundFormat of audio */

/** @return the number in the `size` bytes at `bytes`, most significant first */
uint32_t BigEndian(const uint8_t* bytes, uint32_t size);

/** A tag header and the first two payload bytes, 0 where the payload is shorter. */
struct Tag {
    int64_t position;
    uint32_t type; /**< FLVD_TAG_TYPE_* */
    uint32_t size; /**< payload bytes */
    uint32_t timestamp;
    uint8_t codec;
    uint8_t packetType;

    /** @return the tag at `position` whose first bytes, at least a header, are given */
    static Tag Parse(int64_t position, const uint8_t* bytes, uint32_t available);

    int64_t DataEnd() const { return position + TAG_HEADER_SIZE + size; }
    int64_t End() const { return DataEnd() + BACK_POINTER_SIZE; } /**< behind the back-pointer */
    bool IsVideo() const { return type == FLVD_TAG_TYPE_VIDEO; }
    bool IsAudio() const { return type == FLVD_TAG_TYPE_AUDIO; }
    bool IsAvc() const { return IsVideo() && (codec & 0x0F) == CODEC_ID_AVC; }
    bool IsAac() const { return IsAudio() && codec >> 4 == SOUND_FORMAT_AAC; }
    uint32_t Stream() const { return IsVideo() ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO; }
    uint32_t CodecHeaderSize() const { return IsAvc() ? 5 : IsAac() ? 2 : 1; } /**< bytes in front of the frame */
    bool IsConfig() const { return (IsAvc() || IsAac()) && packetType == 0; }
    bool IsFrame() const; /**< a tag that is played */
    bool IsKeyframe() const { return IsVideo() && IsFrame() && (codec >> 4 == 1 || codec >> 4 == 4); }
};

/**
 * Finds the first tag at or after `from`, however much damage lies before it: one search of the library covers a
 * bounded stretch, and the next is worth making while the reader advances and has not passed `end`.
 *
 * @param progress called with the place that each search without a tag has reached
 * @return where the tag and then the reader stand; nothing when there is none
 */
std::optional<int64_t> FindTag(flvd_ctx_t* instance, fio_file_t* reader, int64_t from, int64_t end,
                               const std::function<void(int64_t)>& progress);

/** Walks over the tags of the streams that were found, those with codec configurations included. */
class TagReader {
public:
    /** @param demuxer borrowed; its main reader is used */
    explicit TagReader(const Demuxer& demuxer);

    /** @return the next audio or video tag; nothing at the end of the data */
    std::optional<Tag> Next();

    /** @return bytes passed so far that belong to none of these tags and to no script tag */
    int64_t Skipped() const { return m_skipped; }
    int64_t FirstSkipped() const { return m_firstSkipped; } /**< their place in the file */

    /** @return what stands behind the codec header of a tag just delivered */
    std::vector<uint8_t> Data(const Tag& tag);

private:
    std::optional<Tag> Find();
    void Skip(int64_t from, int64_t to);

    flvd_ctx_t* m_instance;
    fio_file_t* m_reader;
    const uint32_t m_streams;
    int64_t m_next;
    int64_t m_end; // of the tag before
    int64_t m_skipped = 0;
    int64_t m_firstSkipped = 0;
};

} // namespace tool

#endif
