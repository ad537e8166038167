// Tag navigation: the rules that all its functions share, and what the layers above call beside the exported functions.
//
// The chain of tags is never trusted. A header counts when it is plausible for this file, and in the careful paths only
// when the back-pointer after its data agrees with its size.
//
// Files: frame_tag.cpp finds the tag of the next frame, forward.cpp searches and steps forward, backward.cpp steps
// back, last_tag.cpp finds the end of the last tag, extent.cpp measures a file that is opened.
#ifndef FLVDMX_TAG_TAG_H
#define FLVDMX_TAG_TAG_H

#include "flvdmx/common/tag_header.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/flvdmx.h"

constexpr uint32_t FLVD_ANY_CODEC = 0xFFFF; // filter value: no tag of that kind has been probed

// Resynchronisation covers so many bytes before it gives up.
constexpr int32_t FLVD_RESYNC_WINDOW = 0x100000;

// So many back-pointer checks may fail in one search, and in all searches of one frame request together. A MiB of
// random bytes has some 12,300 plausible headers; a file made of them would cost four host calls for each of its bytes.
constexpr uint32_t FLVD_FAILED_CHECKS_MAX = 16384;

constexpr uint32_t FLVD_TAG_MEDIA = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO;
constexpr uint32_t FLVD_TAG_ANY = FLVD_TAG_MEDIA | FLVD_TAG_SCRIPT;

// Read size of the byte-by-byte paths: each look after a seek reads this much and not a whole cache.
constexpr uint32_t FLVD_NARROW_READ = 16;

// What this file's headers must agree with, taken from the instance once per call.
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

// Header test without the size: type, timestamp ceiling and stream filters.
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

// Header test: plausible for this file.
inline bool FLVD_IsPlausibleTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header)
{
    return int64_t{header.info.data_size} < rules.data_end && FLVD_IsStreamTag(rules, header);
}

// Wanted-kind filter.
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

// Peeks a header at the position. False when fewer bytes than it needs are left.
inline bool FLVD_PeekTagHeader(fio_file_t* file, flvd_tag_header_t* header)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_TAG_PEEK_SIZE, file) < FLVD_TAG_PEEK_SIZE)
        return false;
    *header = FLVD_ReadTagHeader(bytes);
    return true;
}

// Skips the four bytes after a tag's data when they are its back-pointer; anything else stays, for the next search to
// cross. A back-pointer left there could be taken for a tag: its low byte may be 8, 9 or 18.
// False when fewer than 4 bytes are there.
inline bool FLVD_SkipBackPointer(fio_file_t* file, uint32_t data_size)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return false;
    if (FLVD_IsBackPointer(bytes, data_size))
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    return true;
}

// Puts a reader before the first tag, on PreviousTagSize0. Returns the host's seek result.
inline int32_t FLVD_SeekToFirstTag(const flvd_ctx_t* ctx, fio_file_t* file)
{
    return __FLV_DMX__fioSeek64(file, ctx->data_offset, FIO_SEEK_SET);
}

// Skips PreviousTagSize0 when the reader stands on it.
inline void FLVD_SkipFirstBackPointer(const flvd_ctx_t* ctx, fio_file_t* file, int64_t position)
{
    if (position == ctx->data_offset)
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
}

// Moves from a tag's start past its data and compares the back-pointer there. The caller mostly goes back to the tag,
// which empties the cache, so no more is read here than needed; a reader with a narrow read size keeps it: it steps
// from tag to tag, and on from here.
bool FLVD_CheckPastData(fio_file_t* file, uint32_t data_size);

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
    bool checked;   // false: its back-pointer is still to be compared. When it disagrees, the search goes on from
    int64_t start;  // this position of its header,
    int32_t budget; // with so many bytes that resynchronisation may still cross
};

inline flvd_found_tag_t FLVD_CheckedTag(const flvd_tag_header_t& header)
{
    return {header.info.type, header.info.data_size, header.info.timestamp, header.CodecHeaderSize(), true, 0, 0};
}

// FLVD_GetCurrTagInfo in careful mode for a frame request, with a short way for a tag that ends the search at once, as
// most do. Results as there. A tag larger than the cache may be found unchecked: going past its data and back would
// cost two seeks and an empty cache per frame.
int32_t FLVD_FindFrameTag(flvd_frame_search_t* search, flvd_found_tag_t* tag);

// The same after a tag that was found unchecked and whose back-pointer disagrees.
int32_t FLVD_FindFrameTagAfterBad(flvd_frame_search_t* search, flvd_found_tag_t* tag);

constexpr int64_t FLVD_NO_LAST_TAG = 0;

// End of the last tag whose back-pointer and header agree (its PreviousTagSize included); FLVD_NO_LAST_TAG when there
// is none or a seek failed, -1 when a position query failed. `quick` looks at the last few bytes only. The position is
// left anywhere.
int64_t FLVD_FindLastTagEnd(flvd_ctx_t* ctx, bool quick);

// Finds the end of the valid data, the last timestamp and the seek method, and trims the keyframe index.
// 0, or -1 with error and error_line set (unless an index read from the file ends early: no line then).
int32_t FLVD_ProbeExtent(flvd_ctx_t* ctx, bool quick);

#endif
