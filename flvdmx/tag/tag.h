// Tag navigation: the tag header as read, and the rules that all navigation functions share. The chain of tags is
// never trusted: a header counts when it is plausible for this file, and in the careful paths when the back-pointer
// behind its data agrees with its size.
#ifndef FLVDMX_TAG_TAG_H
#define FLVDMX_TAG_TAG_H

#include "flvdmx/common/bytes.h"
#include "flvdmx/common/format.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/flvdmx.h"

constexpr uint32_t FLVD_TAG_PEEK_SIZE = FLVD_TAG_HEADER_SIZE + 2; // header, codec byte and packet type

constexpr uint32_t FLVD_VIDEO_BYTE_MAX = 0x5F; // FrameType 1 to 5, any CodecID

constexpr uint32_t FLVD_ANY_CODEC = 0xFFFF; // filter value: no tag of that kind has been probed

// Resynchronisation covers so many bytes before it gives up.
constexpr int32_t FLVD_RESYNC_WINDOW = 0x100000;

// So many back-pointer checks may fail in one search, and in all searches of one frame request together. A MiB of
// random bytes has some 12,300 plausible headers; a file made of them would cost four host calls for each of its bytes.
constexpr uint32_t FLVD_FAILED_CHECKS_MAX = 16384;

constexpr uint32_t FLVD_TAG_MEDIA = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO;
constexpr uint32_t FLVD_TAG_ANY = FLVD_TAG_MEDIA | FLVD_TAG_SCRIPT;

// Refill quantum of the byte-by-byte paths: each look after a seek reads this much and not a whole cache.
constexpr uint32_t FLVD_NARROW_READ = 16;

// A tag header, taken from 13 peeked bytes.
struct flvd_tag_header_t {
    flvd_tag_info_t info;
    uint8_t first;  // first data byte: FrameType and CodecID, or SoundFormat, rate, size and type
    uint8_t second; // second data byte: AVCPacketType or AACPacketType

    uint32_t CodecId() const { return first & FLVD_CODEC_ID_MASK; }
    uint32_t SoundFormat() const { return uint32_t{first} >> FLVD_SOUND_FORMAT_SHIFT; }
    bool IsVideo() const { return info.type == FLVD_TAG_TYPE_VIDEO; }
    bool IsAudio() const { return info.type == FLVD_TAG_TYPE_AUDIO; }
    bool IsKeyframe() const // FrameType 1 keyframe, 4 generated keyframe
    {
        return (first >> 4u) == 1 || (first >> 4u) == 4;
    }
    bool IsAvc() const { return CodecId() == FLVD_CODEC_AVC; }
    bool IsAac() const { return SoundFormat() == FLVD_SOUND_AAC; }
    uint32_t CodecHeaderSize() const { return FLVD_CodecHeaderSize(IsVideo(), first, second); }
};

// What this file's headers must agree with, read from the instance once a call.
struct flvd_tag_rules_t {
    int64_t data_end;       // DataSize must be below it
    int64_t first_tag;      // start of the first tag
    uint32_t max_timestamp; // a timestamp may not be above it
    uint32_t video_filter;
    uint32_t audio_filter;
};

inline flvd_tag_rules_t FLVD_TagRules(const flvd_ctx_t* ctx)
{
    return {
        ctx->data_end,
        int64_t{ctx->data_offset} + FLVD_BACK_POINTER_SIZE,
        ctx->last_ts != 0 ? ctx->last_ts : UINT32_MAX,
        ctx->video_codec_filter,
        ctx->audio_format_filter,
    };
}

// Timestamp of the tag header at `bytes`, 11 bytes long: TimestampExtended, the top byte, stands behind the other
// three.
[[gnu::always_inline]] constexpr uint32_t FLVD_TagTimestamp(const uint8_t* bytes)
{
    const uint32_t field = FLVD_GetBE32(bytes + FLVD_TIMESTAMP_FIELD);
    return field >> 8 | field << 24;
}

// Reads the header from 13 bytes.
inline flvd_tag_header_t FLVD_ReadTagHeader(const uint8_t* bytes)
{
    const uint32_t type_and_size = FLVD_GetBE32(bytes);
    return {
        {type_and_size >> 24, type_and_size & 0xFFFFFF, FLVD_TagTimestamp(bytes),
         FLVD_GetBE32(bytes + FLVD_STREAM_ID_FIELD) >> 8},
        bytes[FLVD_CODEC_BYTE],
        bytes[FLVD_PACKET_TYPE],
    };
}

// Peeks a header at the position. False when fewer than 13 bytes are left.
inline bool FLVD_PeekTagHeader(fio_file_t* file, flvd_tag_header_t* header)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, file) < FLVD_TAG_PEEK_SIZE)
        return false;
    *header = FLVD_ReadTagHeader(bytes);
    return true;
}

// Header test without the size: type, timestamp ceiling and stream filters.
inline bool FLVD_IsStreamTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    if (header.info.timestamp > rules.max_timestamp)
        return false;
    if (header.IsVideo()) {
        if (rules.video_filter == FLVD_ANY_CODEC)
            return true;
        return header.CodecId() == (rules.video_filter & FLVD_CODEC_ID_MASK) && header.first <= FLVD_VIDEO_BYTE_MAX;
    }
    if (header.IsAudio())
        return rules.audio_filter == FLVD_ANY_CODEC || header.first == rules.audio_filter;
    return header.info.type == FLVD_TAG_TYPE_SCRIPT;
}

// Header test: plausible for this file.
inline bool FLVD_IsPlausibleTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    return int64_t{header.info.data_size} < rules.data_end && FLVD_IsStreamTag(rules, header);
}

// True when the four bytes of a back-pointer belong to a tag of so much data.
constexpr bool FLVD_IsBackPointer(const uint8_t* bytes, uint32_t data_size)
{
    return FLVD_GetBE32(bytes) == data_size + FLVD_TAG_HEADER_SIZE;
}

// Wanted-kind filter.
inline bool FLVD_IsWantedTag(const flvd_tag_header_t& header, uint32_t wanted)
{
    if (header.IsVideo()) {
        if ((wanted & FLVD_TAG_VIDEO) == 0)
            return false;
        if ((wanted & FLVD_TAG_KEYFRAME) != 0)
            return header.IsKeyframe();
        return (wanted & FLVD_TAG_CONFIG) == 0 || !header.IsAvc() || header.second == FLVD_PACKET_SEQUENCE_HEADER;
    }
    if (header.IsAudio()) {
        if ((wanted & FLVD_TAG_AUDIO) == 0)
            return false;
        return (wanted & FLVD_TAG_CONFIG) == 0 || !header.IsAac() || header.second == FLVD_PACKET_SEQUENCE_HEADER;
    }
    return (wanted & FLVD_TAG_SCRIPT) != 0;
}

// Passes the four bytes behind a tag's data when they are its back-pointer; anything else stays, for the next search
// to cross. A back-pointer left standing could be taken for a tag: its low byte may be 8, 9 or 18.
// False when fewer than 4 bytes are there.
bool FLVD_PassBackPointer(fio_file_t* file, uint32_t data_size);

// Moves from a tag's start past its data and compares the back-pointer there. The tag is mostly gone back to, which
// empties the cache, so no more is read here than needed; a reader with a narrow quantum keeps it: it steps from tag to
// tag, and on from here.
bool FLVD_CheckPastData(fio_file_t* file, uint32_t data_size);

// Takes the position a search begins at, and passes PreviousTagSize0 when the reader stands on it. Below 0: the query
// failed.
inline int64_t FLVD_StartOnTag(const flvd_ctx_t* ctx, fio_file_t* file)
{
    const int64_t position = FLVD_FioTell(file);
    if (position == ctx->data_offset)
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    return position;
}

// What a frame request is looking for.
struct flvd_frame_search_t {
    flvd_ctx_t* ctx;
    fio_file_t* file;
    uint32_t wanted;
    uint32_t checks_left; // back-pointer checks that may still fail
};

// A tag found for it. The reader stands on its header.
struct flvd_found_tag_t {
    uint32_t type;
    uint32_t data_size;
    uint32_t timestamp;
    uint32_t codec_header; // bytes before the frame; 0: a configuration, no frame
    bool checked;          // false: its back-pointer is still to be compared, and what goes on from there is this:
    int64_t start;         // position of its header
    int32_t budget;        // bytes that resynchronisation may still cross
};

inline flvd_found_tag_t FLVD_CheckedTag(const flvd_tag_header_t& header)
{
    return {header.info.type, header.info.data_size, header.info.timestamp, header.CodecHeaderSize(), true, 0, 0};
}

// True when a wanted tag is delivered before its back-pointer is checked: going there and coming back would cost two
// seeks and an empty cache per frame. A frame that does not fit the buffer is checked first, so that no false header
// makes the buffer grow, and so is every tag once a check has failed: a request reads one payload in vain at most.
inline bool FLVD_IsReadBeforeCheck(const flvd_frame_search_t& search, const flvd_found_tag_t& tag)
{
    return tag.data_size + FLVD_TAG_OVERHEAD > search.file->capacity && tag.codec_header != 0 &&
           tag.data_size - tag.codec_header <= search.ctx->frame_buffer_size &&
           search.checks_left == FLVD_FAILED_CHECKS_MAX;
}

// FLVD_GetCurrTagInfo in careful mode for a frame request, with a short way for a tag that ends the search at once, as
// most do. Results as there.
int32_t FLVD_FindFrameTag(flvd_frame_search_t* search, flvd_found_tag_t* tag);

// The same after a tag that was found unchecked and whose back-pointer disagrees.
int32_t FLVD_FindFrameTagAfterBad(flvd_frame_search_t* search, flvd_found_tag_t* tag);

// The search of FLVD_FindFrameTag from a position that was taken.
int32_t FLVD_SearchForFrame(flvd_frame_search_t* search, int64_t position, flvd_found_tag_t* tag);

// Puts a reader in front of the first tag, on PreviousTagSize0. Returns the host's seek result.
int32_t FLVD_SeekToFirstTag(const flvd_ctx_t* ctx, fio_file_t* file);

// End of the last tag whose back-pointer and header agree (its PreviousTagSize included); 0 when there is none or a
// seek failed, -1 when a position query failed. `quick` looks at the last few bytes only. The position is left
// anywhere.
int64_t FLVD_FindLastTagEnd(flvd_ctx_t* ctx, bool quick);

// Finds the end of the valid data, the last timestamp and the seek method, and trims the keyframe index.
// 0, or -1 with error and error_line set (unless an index read from the file ends early: no line then).
int32_t FLVD_ProbeExtent(flvd_ctx_t* ctx, bool quick);

#endif
