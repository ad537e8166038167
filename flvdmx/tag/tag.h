// Tag navigation: the rules that all its functions share, and the internal functions that the layers above call.
//
// The chain of tags is never trusted. A header must be plausible for this file, and in a careful search the
// back-pointer after its data must agree with its size.
//
// Files: frame_tag.cpp finds the tag of the next frame, forward.cpp searches and steps forward, backward.cpp steps
// back, last_tag.cpp finds the end of the last tag, extent.cpp finds the end of the valid data during an open.
#ifndef FLVDMX_TAG_TAG_H
#define FLVDMX_TAG_TAG_H

#include "flvdmx/common/tag_header.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/flvdmx.h"

constexpr uint32_t FLVD_ANY_CODEC = 0xFFFF; // filter value before a tag of that kind was probed

// Resynchronisation gives up after this many bytes.
constexpr int32_t FLVD_RESYNC_WINDOW = 0x100000;

// Back-pointer checks that may fail in one search, or in all searches of one frame request together. 1 MiB of random
// bytes has some 12,300 plausible headers; without this bound, a file full of them would cost four host calls per byte.
constexpr uint32_t FLVD_FAILED_CHECKS_MAX = 16384;

constexpr uint32_t FLVD_TAG_MEDIA = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO;
constexpr uint32_t FLVD_TAG_ANY = FLVD_TAG_MEDIA | FLVD_TAG_SCRIPT;

// Read size of the searches that move byte by byte: they need only this much after each seek, not a whole cache.
constexpr uint32_t FLVD_NARROW_READ = 16;

// What a plausible header of this file must agree with. Copied from the instance once per call.
struct flvd_tag_rules_t {
    int64_t data_end;       // DataSize must be below this
    int64_t first_tag;      // start of the first tag
    uint32_t max_timestamp; // the timestamp must not be above this
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

// Checks a header except for its size: type, timestamp ceiling, stream filters.
inline bool FLVD_IsStreamTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    if (header.info.timestamp > rules.max_timestamp)
        return false;
    if (header.IsVideo()) {
        if (rules.video_filter == FLVD_ANY_CODEC)
            return true;
        return header.CodecId() == (rules.video_filter & FLVD_CODEC_ID_MASK) &&
               header.codec_byte <= FLVD_CODEC_BYTE_MAX;
    }
    if (header.IsAudio())
        return rules.audio_filter == FLVD_ANY_CODEC || header.codec_byte == rules.audio_filter;
    return header.info.type == FLVD_TAG_TYPE_SCRIPT;
}

// Checks whether a header is plausible for this file.
inline bool FLVD_IsPlausibleTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    return int64_t{header.info.data_size} < rules.data_end && FLVD_IsStreamTag(rules, header);
}

// Checks whether a tag is of a wanted kind (FLVD_TAG_* bits).
inline bool FLVD_IsWantedTag(const flvd_tag_header_t& header, uint32_t wanted)
{
    if (header.IsVideo()) {
        if ((wanted & FLVD_TAG_VIDEO) == 0)
            return false;
        if ((wanted & FLVD_TAG_KEYFRAME) != 0)
            return header.IsKeyframe();
        return (wanted & FLVD_TAG_CONFIG) == 0 || header.IsAvcConfigOrOther();
    }
    if (header.IsAudio()) {
        if ((wanted & FLVD_TAG_AUDIO) == 0)
            return false;
        return (wanted & FLVD_TAG_CONFIG) == 0 || header.IsAacConfigOrOther();
    }
    return (wanted & FLVD_TAG_SCRIPT) != 0;
}

// Peeks at the header at the position. False when fewer than FLVD_TAG_PEEK_SIZE bytes are left.
inline bool FLVD_PeekTagHeader(fio_file_t* file, flvd_tag_header_t* header)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, file) < FLVD_TAG_PEEK_SIZE)
        return false;
    *header = FLVD_ReadTagHeader(bytes);
    return true;
}

// Skips the four bytes after a tag's data if they are its back-pointer, and leaves anything else to the next search.
// A back-pointer must not stay: later searches could mistake it for a tag, since its low byte may be 8, 9 or 18.
// False when fewer than 4 bytes are left.
inline bool FLVD_SkipBackPointer(fio_file_t* file, uint32_t data_size)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return false;
    if (FLVD_IsBackPointer(bytes, data_size))
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    return true;
}

// Moves a reader before the first tag, to PreviousTagSize0. Returns the result of the host's seek.
inline int32_t FLVD_SeekToFirstTag(const flvd_ctx_t* ctx, fio_file_t* file)
{
    return __FLV_DMX__fioSeek64(file, ctx->data_offset, FIO_SEEK_SET);
}

// Skips PreviousTagSize0 if that is where the reader stands.
inline void FLVD_SkipFirstBackPointer(const flvd_ctx_t* ctx, fio_file_t* file, int64_t position)
{
    if (position == ctx->data_offset)
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
}

// Moves from a tag's start past its data and checks the back-pointer there. Callers usually seek back to the tag, which
// empties the cache, so this reads no more than the back-pointer. A reader with a narrow read size keeps that size: it
// steps from tag to tag and continues from here.
bool FLVD_CheckPastData(fio_file_t* file, uint32_t data_size);

// What a frame request searches for.
struct flvd_frame_search_t {
    flvd_ctx_t* ctx;
    fio_file_t* file;
    uint32_t wanted;
    uint32_t checks_left; // back-pointer checks that may still fail
};

// The tag found for it. The reader stands at its header.
struct flvd_found_tag_t {
    uint32_t type;
    uint32_t data_size;
    uint32_t timestamp;
    uint32_t codec_header; // bytes before the frame; 0: the tag carries no frame
    // When it is not checked, the caller must check the back-pointer. If that disagrees, the search continues from
    // `start`, the position of the header, with `budget` bytes that resynchronisation may still cross.
    bool checked;
    int64_t start;
    int32_t budget;
};

inline flvd_found_tag_t FLVD_CheckedTag(const flvd_tag_header_t& header)
{
    return {header.info.type, header.info.data_size, header.info.timestamp, header.CodecHeaderSize(), true, 0, 0};
}

// FLVD_GetCurrTagInfo in careful mode for a frame request, with a fast path for the usual case that the very next tag
// is the one wanted. Same results. A tag larger than the cache may be found unchecked, because moving past its data and
// back would cost two seeks and the cached bytes.
int32_t FLVD_FindFrameTag(flvd_frame_search_t* search, flvd_found_tag_t* tag);

// Continues the search after a tag that was found unchecked and whose back-pointer turned out to disagree.
int32_t FLVD_FindFrameTagAfterBad(flvd_frame_search_t* search, flvd_found_tag_t* tag);

constexpr int64_t FLVD_NO_LAST_TAG = 0;

// Returns the end of the last tag whose back-pointer and header agree (its PreviousTagSize included), FLVD_NO_LAST_TAG
// when there is none or a seek failed, or -1 when a tell failed. `quick` examines only the last few bytes. The reader
// may stand anywhere afterwards.
int64_t FLVD_FindLastTagEnd(flvd_ctx_t* ctx, bool quick);

// Finds the end of the valid data, the last timestamp and the seek method, and trims the keyframe index. Returns 0, or
// -1 with error and error_line set, except when an index in the file ends early: that records nothing.
int32_t FLVD_ProbeExtent(flvd_ctx_t* ctx, bool quick);

#endif
