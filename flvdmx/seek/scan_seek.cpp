// Frame seek by scanning: starts at the start of the file, its end or an estimated position, whichever is nearest, and
// walks from tag to tag until it reaches the target.
//
// A walk never ends at an AVC configuration or end-of-sequence tag: its FrameType says keyframe, but it has no picture.
// Forward means at or after the target, so only a backward seek may end before the first tag.

#include "flvdmx/seek/seek.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/tag/tag.h"

namespace {

constexpr uint32_t FLVD_BYTE_RATE_MS = 1024; // byte_rate is in bytes per 1024 ms

// The estimated position may be inside a tag of up to 16 MiB, and one search for the next tag covers 1 MiB.
constexpr uint32_t FLVD_FIRST_STEP_TRIES = 16;

// One scan seek.
struct flvd_scan_t {
    flvd_ctx_t* ctx;
    fio_file_t* file;
    uint32_t kind; // FLVD_TAG_* bits of the tags at which walks may end
    uint32_t target;
    uint32_t* result;
    bool backward;
    bool audio;
    flvd_tag_info_t tag; // the last tag reached
    int64_t steps;       // number of steps in the last walk
};

// Walks may turn round: a backward seek that starts before its target walks forward first, and then back to a keyframe.
// A seek makes at most four walks.
int32_t FLVD_SeekBackward(flvd_scan_t* scan);

// The result of the seek is ignored: if it fails, the walk starts where the reader stands and still ends on the correct
// side of the target.
void FLVD_StartAt(const flvd_scan_t* scan, int64_t position)
{
    __FLV_DMX__fioSeek64(scan->file, position, FIO_SEEK_SET);
}

int32_t FLVD_FailWalk(const flvd_scan_t* scan, int32_t code)
{
    FLVD_Record(scan->ctx, scan->audio ? FLVD_SITE_AUDIO_WALK : FLVD_SITE_VIDEO_WALK);
    return code == FLVD_ERR_END_OF_DATA ? FLVD_ERR_NOT_FOUND : code; // running out of data here is not a miss
}

int32_t FLVD_Answer(const flvd_scan_t* scan)
{
    *scan->result = scan->tag.timestamp;
    return 0;
}

// The target is before the first tag of the kind. Playing from the first tag of the file is then right for all
// streams.
int32_t FLVD_AnswerFirstTag(const flvd_scan_t* scan)
{
    FLVD_SeekToFirstTag(scan->ctx, scan->file);
    *scan->result = scan->ctx->first_ts;
    return 0;
}

// Walks until the target is reached or passed. Returns 0, or the result of the step that failed.
int32_t FLVD_Walk(flvd_scan_t* scan, bool forward)
{
    const auto step = forward ? FLVD_MoveToNextTag : FLVD_MoveToPrevTag;
    // More steps than the data has room for tags: a host with wrong positions could keep a walk running forever.
    const int64_t most_steps = scan->ctx->data_end >> 3;
    for (scan->steps = 0;;) {
        if (FLVD_FioAtEnd(scan->file))
            return scan->steps != 0 && forward ? FLVD_ERR_END_OF_DATA : FLVD_ERR_NOT_FOUND;
        if (scan->steps++ > most_steps)
            return FLVD_ERR_NOT_FOUND;
        const int32_t code = step(scan->ctx, scan->file, &scan->tag, scan->kind, nullptr);
        if (code != 0)
            return code;
        const bool reached = forward ? scan->tag.timestamp >= scan->target : scan->tag.timestamp <= scan->target;
        if (!reached)
            continue;
        flvd_tag_header_t header;
        if (!FLVD_PeekTagHeader(scan->file, &header))
            return FLVD_ERR_NOT_FOUND;
        if (!header.IsPictureless())
            return 0;
    }
}

// Answers when the tags end before the target. Audio then ends at the end of the data, which is not a miss.
int32_t FLVD_SeekAtEnd(flvd_scan_t* scan)
{
    FLVD_StartAt(scan, scan->ctx->data_end);
    if (scan->backward && !scan->audio)
        return FLVD_SeekBackward(scan);
    *scan->result = scan->ctx->last_ts;
    return scan->audio ? 0 : FLVD_ERR_END_OF_DATA;
}

// Walks forward from the position and answers.
int32_t FLVD_SeekForward(flvd_scan_t* scan)
{
    int32_t code = FLVD_Walk(scan, true);
    if (code == FLVD_ERR_END_OF_DATA)
        return FLVD_SeekAtEnd(scan);
    if (code == 0 && scan->backward && scan->tag.timestamp != scan->target) {
        code = FLVD_Walk(scan, false);
        if (code == FLVD_ERR_AT_FIRST_TAG)
            return FLVD_AnswerFirstTag(scan);
    }
    return code == 0 ? FLVD_Answer(scan) : FLVD_FailWalk(scan, code);
}

int32_t FLVD_SeekFromStart(flvd_scan_t* scan)
{
    FLVD_StartAt(scan, scan->ctx->data_offset);
    return FLVD_SeekForward(scan);
}

// Answers after a backward walk with this result.
int32_t FLVD_EndBackwardWalk(flvd_scan_t* scan, int32_t code)
{
    if (code == FLVD_ERR_AT_FIRST_TAG)
        return scan->backward ? FLVD_AnswerFirstTag(scan) : FLVD_SeekFromStart(scan);
    if (code == 0 && !scan->backward && scan->tag.timestamp != scan->target) {
        code = FLVD_Walk(scan, true);
        if (code == FLVD_ERR_END_OF_DATA)
            return FLVD_SeekAtEnd(scan);
    }
    return code == 0 ? FLVD_Answer(scan) : FLVD_FailWalk(scan, code);
}

// Walks backward from the position and answers.
int32_t FLVD_SeekBackward(flvd_scan_t* scan)
{
    return FLVD_EndBackwardWalk(scan, FLVD_Walk(scan, false));
}

// Audio whose last tag is earlier than the target has ended: it continues at the end of the data, not at that tag,
// which would be played out of time.
int32_t FLVD_SeekFromEnd(flvd_scan_t* scan)
{
    FLVD_StartAt(scan, scan->ctx->data_end);
    const int32_t code = FLVD_Walk(scan, false);
    const bool after_last_tag = code == 0 && scan->steps == 1 && scan->tag.timestamp < scan->target;
    return scan->audio && after_last_tag ? FLVD_SeekAtEnd(scan) : FLVD_EndBackwardWalk(scan, code);
}

// Walks from the tag at the position and answers. When that tag has the target's time but is not the answer, the answer
// may be on either side: the walk then starts against the seek direction, so that the way back passes the tag again.
int32_t FLVD_SeekFromTag(flvd_scan_t* scan)
{
    const bool ahead = scan->target > scan->tag.timestamp || (scan->target == scan->tag.timestamp && scan->backward);
    return ahead ? FLVD_SeekForward(scan) : FLVD_SeekBackward(scan);
}

// Which position is nearest to the target in time: the start, the end, or one whose time is known.
// Timestamps stand for distances in bytes, which holds as long as the bit rate does not vary too much.
enum class FlvdNearest { Start, Known, End };

FlvdNearest FLVD_Nearest(const flvd_scan_t* scan, uint32_t known)
{
    const uint32_t distance = FLVD_TimeDistance(scan->target, known);
    if (distance > scan->target)
        return FlvdNearest::Start;
    return int64_t{distance} >= int64_t{scan->ctx->last_ts} - scan->target ? FlvdNearest::End : FlvdNearest::Known;
}

// Finds the first tag of a kind at or after the reader's estimated position, or else the last one of the file. Returns
// 0 with the tag, FLVD_ERR_AT_FIRST_TAG when there is none, or -1.
int32_t FLVD_FirstTag(flvd_scan_t* scan, uint32_t kind, flvd_site_t site)
{
    int32_t code = FLVD_ERR_NOT_FOUND;
    for (uint32_t tries = 0; tries < FLVD_FIRST_STEP_TRIES && code == FLVD_ERR_NOT_FOUND; ++tries)
        code = FLVD_MoveToNextTag(scan->ctx, scan->file, &scan->tag, kind, nullptr);
    if (code == FLVD_ERR_NOT_FOUND)
        return FLVD_Fail(scan->ctx, site);
    if (code != FLVD_ERR_END_OF_DATA)
        return code;
    FLVD_StartAt(scan, scan->ctx->data_end);
    code = FLVD_MoveToPrevTag(scan->ctx, scan->file, &scan->tag, kind, nullptr);
    return code == 0 || code == FLVD_ERR_AT_FIRST_TAG ? code : FLVD_ERR_NOT_FOUND;
}

// File position of a timestamp at a constant byte rate. Tags are small compared with its error, so the file header and
// script data are not allowed for.
int64_t FLVD_EstimatePosition(const flvd_ctx_t* ctx, uint32_t target)
{
    const uint64_t time = target > ctx->first_ts ? target - ctx->first_ts : 0;
    return static_cast<int64_t>(time * ctx->byte_rate / FLVD_BYTE_RATE_MS); // two 32-bit factors: below 2^54
}

// Answers from the first tag at or after the estimated position.
int32_t FLVD_SeekFromFirstTag(flvd_scan_t* scan)
{
    flvd_tag_header_t header;
    if (scan->tag.timestamp == scan->target && FLVD_PeekTagHeader(scan->file, &header) && header.IsKeyframe() &&
        !header.IsPictureless())
        return FLVD_Answer(scan);
    switch (FLVD_Nearest(scan, scan->tag.timestamp)) {
    case FlvdNearest::Start:
        return FLVD_SeekFromStart(scan);
    case FlvdNearest::End:
        return FLVD_SeekFromEnd(scan);
    default:
        return FLVD_SeekFromTag(scan);
    }
}

// A separate audio reader starts where the video seek left the main reader.
int32_t FLVD_SeekAfterVideo(flvd_scan_t* scan)
{
    const int64_t position = FLVD_FioTell(scan->ctx->main_reader);
    if (position < 0)
        return FLVD_Fail(scan->ctx, FLVD_SITE_AUDIO_FOLLOW_POSITION);
    if (__FLV_DMX__fioSeek64(scan->file, position, FIO_SEEK_SET) != 0)
        return FLVD_Fail(scan->ctx, FLVD_SITE_AUDIO_FOLLOW_SEEK);
    const int32_t code = FLVD_FirstTag(scan, FLVD_TAG_AUDIO, FLVD_SITE_AUDIO_FIRST_STEP);
    if (code == FLVD_ERR_AT_FIRST_TAG)
        return FLVD_AnswerFirstTag(scan);
    if (code != 0)
        return code;
    return scan->tag.timestamp == scan->target ? FLVD_Answer(scan) : FLVD_SeekFromTag(scan);
}

// Starts at the next audio tag after the current position. Without one, the target is reached from the end.
int32_t FLVD_SeekFromHere(flvd_scan_t* scan)
{
    if (FLVD_GetCurrTagInfo(scan->ctx, scan->file, &scan->tag, FLVD_TAG_AUDIO, 1) != 0)
        return FLVD_SeekFromEnd(scan);
    return scan->tag.timestamp == scan->target ? FLVD_Answer(scan) : FLVD_SeekFromTag(scan);
}

// Audio that no video leads: a file without video, or the shared reader. The current position is a good start, because
// most seeks are short.
int32_t FLVD_SeekAudioAlone(flvd_scan_t* scan)
{
    switch (FLVD_Nearest(scan, scan->ctx->last_audio_ts + scan->ctx->first_ts)) {
    case FlvdNearest::Start:
        return FLVD_SeekFromStart(scan);
    case FlvdNearest::End:
        return FLVD_SeekFromEnd(scan);
    default:
        return FLVD_SeekFromHere(scan);
    }
}

} // namespace

int32_t FLVD_RunVideoScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction)
{
    const bool backward = direction == FLVD_DIRECTION_BACKWARD;
    flvd_scan_t scan = {ctx, ctx->main_reader, FLVD_TAG_VIDEO | FLVD_TAG_KEYFRAME, target, result, backward, false, {},
                        0};
    const FLVD_ReadSizeGuard narrow(scan.file, ctx->scan_read_size, FLVD_WHOLE_CACHE);
    if (__FLV_DMX__fioSeek64(scan.file, FLVD_EstimatePosition(ctx, target), FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_VIDEO_ESTIMATE);
    const int32_t code = FLVD_FirstTag(&scan, FLVD_TAG_VIDEO, FLVD_SITE_VIDEO_FIRST_STEP);
    if (code == FLVD_ERR_AT_FIRST_TAG)
        return FLVD_AnswerFirstTag(&scan);
    return code == 0 ? FLVD_SeekFromFirstTag(&scan) : code;
}

int32_t FLVD_RunAudioScanSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t direction)
{
    const bool backward = direction == FLVD_DIRECTION_BACKWARD;
    flvd_scan_t scan = {ctx, ctx->audio_reader, FLVD_TAG_AUDIO, target, result, backward, true, {}, 0};
    const FLVD_ReadSizeGuard narrow(scan.file, ctx->scan_read_size, FLVD_WHOLE_CACHE);
    return FLVD_HasAudioReader(ctx) && FLVD_HasVideo(ctx) ? FLVD_SeekAfterVideo(&scan) : FLVD_SeekAudioAlone(&scan);
}
