// Time seek: converts the host's time to a target timestamp and a direction, moves the readers with frame seeks, and
// restores their positions if anything fails, so that delivery continues where it was.
//
// last_video_ts and last_audio_ts count from first_ts; frame seeks use the timestamps of the file. A saved position of
// 0 stands for none: the file header is there, and no reader goes back to it.

#include "flvdmx/seek/seek.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/tag/tag.h"

namespace {

constexpr int32_t FLVD_MISS = FLVD_ERR_END_OF_DATA;

// One time seek.
struct flvd_time_seek_t {
    flvd_ctx_t* ctx;
    int32_t time;
    uint32_t mode;
    bool growing;
    int64_t target; // file timestamp
    uint32_t direction;
    uint32_t reached; // file timestamp
};

// A relative seek by 0 reports the current time and moves nothing.
bool FLVD_IsByZero(const flvd_time_seek_t& seek)
{
    return (seek.mode & FLVD_SEEK_RELATIVE) != 0 && seek.time == 0;
}

// Current position in ms from first_ts.
uint32_t FLVD_CurrentTime(const flvd_time_seek_t& seek)
{
    const flvd_ctx_t* const ctx = seek.ctx;
    return seek.growing || FLVD_HasVideo(ctx) ? ctx->last_video_ts : ctx->last_audio_ts;
}

// Computes target and direction, in 64 bits because file timestamps may use all 32 bits.
void FLVD_ChooseTarget(flvd_time_seek_t* seek)
{
    const uint32_t current = FLVD_CurrentTime(*seek) + seek->ctx->first_ts;
    bool backward = false;
    if ((seek->mode & FLVD_SEEK_RELATIVE) != 0) {
        seek->target = int64_t{current} + seek->time;
        backward = seek->time < 0;
    } else {
        seek->target = int64_t{seek->ctx->first_ts} + seek->time;
        backward = seek->target < int64_t{current};
    }
    // Both direction bits at once count as none.
    const uint32_t forced = seek->mode & FLVD_SEEK_DIRECTION_MASK;
    if (forced == FLVD_SEEK_BACKWARD || forced == FLVD_SEEK_FORWARD)
        backward = forced == FLVD_SEEK_BACKWARD;
    seek->direction = backward ? FLVD_DIRECTION_BACKWARD : FLVD_DIRECTION_FORWARD;
}

// Saves a reader's position unless one is saved already. False when the tell fails.
bool FLVD_SavePosition(fio_file_t* reader, int64_t* saved)
{
    if (*saved != 0)
        return true;
    const int64_t position = FLVD_FioTell(reader);
    if (position < 0)
        return false;
    *saved = position;
    return true;
}

// A restore that fails keeps the position, so that the next frame request of a growing file can try again.
void FLVD_RestorePosition(fio_file_t* reader, int64_t* saved)
{
    if (*saved != 0 && __FLV_DMX__fioSeek64(reader, *saved, FIO_SEEK_SET) == 0)
        *saved = 0;
}

void FLVD_RestorePositions(flvd_ctx_t* ctx)
{
    FLVD_RestorePosition(ctx->main_reader, &ctx->saved_main_pos);
    if (FLVD_HasAudioReader(ctx) && FLVD_HasAudio(ctx))
        FLVD_RestorePosition(ctx->audio_reader, &ctx->saved_audio_pos);
}

// Moves the readers to the first tag. A tell that fails is no failure here; that position just cannot be restored.
int32_t FLVD_RewindReaders(flvd_time_seek_t* seek)
{
    flvd_ctx_t* const ctx = seek->ctx;
    FLVD_SavePosition(ctx->main_reader, &ctx->saved_main_pos);
    if (FLVD_HasAudioReader(ctx))
        FLVD_SavePosition(ctx->audio_reader, &ctx->saved_audio_pos);
    if (FLVD_SeekToFirstTag(ctx, ctx->main_reader) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_REWIND);
    if (FLVD_HasAudioReader(ctx) && FLVD_SeekToFirstTag(ctx, ctx->audio_reader) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_REWIND);
    // Times count from the first timestamp, so both streams are at 0 again.
    ctx->last_video_ts = 0;
    ctx->last_audio_ts = 0;
    seek->reached = ctx->first_ts;
    return 0;
}

// Saves a reader's position and moves the reader with a frame seek. Stores the time found in seek->reached and as the
// stream's current position.
int32_t FLVD_MoveStream(flvd_time_seek_t* seek, uint32_t stream, flvd_site_t position_site, flvd_site_t seek_site)
{
    flvd_ctx_t* const ctx = seek->ctx;
    const bool own_reader = stream == FLVD_STREAM_AUDIO && FLVD_HasAudioReader(ctx);
    if (!FLVD_SavePosition(own_reader ? ctx->audio_reader : ctx->main_reader,
                           own_reader ? &ctx->saved_audio_pos : &ctx->saved_main_pos))
        return FLVD_Fail(ctx, position_site);
    const auto frame_seek = seek->growing ? FLVD_RunFrameSeekProgressive : FLVD_RunFrameSeek;
    uint32_t found = 0;
    const int32_t result = frame_seek(ctx, static_cast<uint32_t>(seek->target), &found, stream, seek->direction);
    if (result < 0) {
        FLVD_Record(ctx, seek_site);
        return result;
    }
    seek->reached = found;
    (stream == FLVD_STREAM_VIDEO ? ctx->last_video_ts : ctx->last_audio_ts) = found - ctx->first_ts;
    return 0;
}

// One reader delivers both streams, so video decides where it goes, and audio continues from there.
int32_t FLVD_MoveOneReader(flvd_time_seek_t* seek)
{
    flvd_ctx_t* const ctx = seek->ctx;
    const uint32_t stream = FLVD_HasVideo(ctx) ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
    const int32_t result = FLVD_MoveStream(seek, stream, FLVD_SITE_SEEK_ONE_READER_POSITION, FLVD_SITE_SEEK_ONE_READER);
    if (result == 0 && FLVD_HasAudio(ctx))
        ctx->last_audio_ts = seek->reached - ctx->first_ts;
    return result;
}

// Moves video first, then audio to the time that video reached, which is also the time to report.
int32_t FLVD_MoveTwoReaders(flvd_time_seek_t* seek)
{
    const flvd_ctx_t* const ctx = seek->ctx;
    if (!FLVD_HasVideo(ctx))
        return FLVD_MoveStream(seek, FLVD_STREAM_AUDIO, FLVD_SITE_SEEK_AUDIO_POSITION, FLVD_SITE_SEEK_AUDIO);
    const int32_t result =
        FLVD_MoveStream(seek, FLVD_STREAM_VIDEO, FLVD_SITE_SEEK_VIDEO_POSITION, FLVD_SITE_SEEK_VIDEO);
    if (result < 0 || !FLVD_HasAudio(ctx))
        return result;
    const uint32_t video = seek->reached;
    seek->target = video;
    seek->direction = FLVD_DIRECTION_BACKWARD;
    const int32_t audio = FLVD_MoveStream(seek, FLVD_STREAM_AUDIO, FLVD_SITE_SEEK_AUDIO_POSITION, FLVD_SITE_SEEK_AUDIO);
    seek->reached = video;
    return audio;
}

// Growing file: moves the separate audio reader to where the main reader stands, without searching for an audio tag.
int32_t FLVD_FollowVideo(const flvd_time_seek_t& seek)
{
    flvd_ctx_t* const ctx = seek.ctx;
    if (!FLVD_SavePosition(ctx->audio_reader, &ctx->saved_audio_pos))
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_AUDIO_POSITION);
    const int64_t position = FLVD_FioTell(ctx->main_reader);
    if (position < 0)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_FOLLOW_POSITION);
    if (__FLV_DMX__fioSeek64(ctx->audio_reader, position, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_FOLLOW);
    ctx->last_audio_ts = seek.reached - ctx->first_ts;
    return 0;
}

// Only video can be sought in a growing file, since the index has no audio and there is no end to scan from.
int32_t FLVD_MoveGrowing(flvd_time_seek_t* seek)
{
    const int32_t result =
        FLVD_MoveStream(seek, FLVD_STREAM_VIDEO, FLVD_SITE_SEEK_VIDEO_POSITION, FLVD_SITE_SEEK_VIDEO);
    const bool follows = FLVD_HasAudioReader(seek->ctx) && FLVD_HasAudio(seek->ctx);
    return result == 0 && follows ? FLVD_FollowVideo(*seek) : result;
}

// True when the target is past the end. The last timestamp of a growing file is not known; there the index decides.
bool FLVD_IsBeyondEnd(const flvd_time_seek_t& seek)
{
    const bool unknown = seek.growing && seek.ctx->last_ts == 0;
    return seek.target > (unknown ? int64_t{UINT32_MAX} : int64_t{seek.ctx->last_ts});
}

// Checks the request and moves the readers. Returns 0, FLVD_MISS or another negative value.
int32_t FLVD_MoveReaders(flvd_time_seek_t* seek)
{
    flvd_ctx_t* const ctx = seek->ctx;
    if (ctx->opened_for_info != 0)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_INFO_ONLY);
    if (ctx->seek_method == FLVD_SEEK_NONE || (seek->growing && !FLVD_HasVideo(ctx)))
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_NOT_SEEKABLE);
    if (FLVD_IsByZero(*seek)) {
        seek->reached = FLVD_CurrentTime(*seek) + ctx->first_ts;
        return 0;
    }
    FLVD_ChooseTarget(seek);
    // A target at or before the file timestamp 0 needs no search, and works in files whose tags start later.
    if (seek->target <= 0)
        return FLVD_RewindReaders(seek);
    if (FLVD_IsBeyondEnd(*seek))
        return FLVD_MISS;
    if (seek->growing)
        return FLVD_MoveGrowing(seek);
    return FLVD_HasAudioReader(ctx) ? FLVD_MoveTwoReaders(seek) : FLVD_MoveOneReader(seek);
}

// Makes one attempt: moves the readers, or restores their positions. Returns 0, FLVD_MISS or another negative value.
int32_t FLVD_Attempt(flvd_time_seek_t* seek, int32_t* result)
{
    const int32_t moved = FLVD_MoveReaders(seek);
    if (moved < 0) {
        FLVD_RestorePositions(seek->ctx);
        return moved;
    }
    *result = static_cast<int32_t>(seek->reached - seek->ctx->first_ts);
    if (!seek->growing || !FLVD_IsByZero(*seek)) { // else keep it: an incomplete tag may wait for its retry
        seek->ctx->saved_main_pos = 0;
        seek->ctx->saved_audio_pos = 0;
    }
    return 0;
}

// After a miss, moves the readers to the end of the file if the mode says so.
void FLVD_SeekToEnd(const flvd_time_seek_t& seek)
{
    if ((seek.mode & FLVD_SEEK_TO_END_ON_MISS) == 0)
        return;
    __FLV_DMX__fioSeek64(seek.ctx->main_reader, 0, FIO_SEEK_END);
    if (FLVD_HasAudioReader(seek.ctx))
        __FLV_DMX__fioSeek64(seek.ctx->audio_reader, 0, FIO_SEEK_END);
}

int32_t FLVD_RunSeek(flvd_time_seek_t seek, int32_t* result)
{
    int32_t moved = FLVD_Attempt(&seek, result);
    if (moved == FLVD_MISS) {
        FLVD_SeekToEnd(seek);
        if ((seek.mode & FLVD_SEEK_RETRY_BACKWARD) != 0) {
            seek.mode = FLVD_SEEK_BACKWARD; // no longer relative
            moved = FLVD_Attempt(&seek, result);
        }
    }
    if (moved == FLVD_MISS)
        FLVD_Record(seek.ctx, FLVD_SITE_SEEK_MISS);
    return moved == 0 ? 0 : -1;
}

} // namespace

int32_t FLVD_RunTimeSeek(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode)
{
    return FLVD_RunSeek({ctx, time, mode, false, 0, FLVD_DIRECTION_FORWARD, 0}, result);
}

int32_t FLVD_RunTimeSeekProgressive(flvd_ctx_t* ctx, int32_t time, int32_t* result, uint32_t mode)
{
    return FLVD_RunSeek({ctx, time, mode, true, 0, FLVD_DIRECTION_FORWARD, 0}, result);
}
