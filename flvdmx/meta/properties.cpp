// Stores the values of known properties in the instance and its stream descriptions (onMetaData, annex E.5).
//
// Values are hints: the first tags of a stream describe it as well and, where they come later, replace what is stored
// here. Only numbers are used. A property with a value of another type takes whatever the value slot holds.

#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/amf.h"
#include "flvdmx/meta/keys.h"
#include "flvdmx/meta/meta.h"

namespace {

constexpr double FLVD_META_FRAME_RATE_UNIT = 1000.0; // frame_rate counts thousandths of a frame per second

// Bits of flvd_script_state_t::flags.
constexpr uint32_t FLVD_META_IN_KEYFRAMES = 0x10;
constexpr uint32_t FLVD_META_TIMES_SEEN = 0x20;
constexpr uint32_t FLVD_META_POSITIONS_SEEN = 0x40;
constexpr uint32_t FLVD_META_INDEX_SEEN = FLVD_META_IN_KEYFRAMES | FLVD_META_TIMES_SEEN | FLVD_META_POSITIONS_SEEN;

// "filesize". A complete file has been measured by now, so a larger value shows that the file was cut off.
void FLVD_AssignFileSize(flvd_ctx_t* ctx, uint32_t size)
{
    if (ctx->file_size == 0)
        ctx->file_size = size;
    else if (ctx->file_size < int64_t{size})
        ctx->file_shorter_than_meta = 1;
}

// After one of the two arrays: the usable entries are those that both have. Once both have been seen, the index is
// complete, and the offsets of later arrays with these names are ignored.
void FLVD_AssignEntryCount(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    if (state->array_count < ctx->keyframe_index.entry_count)
        ctx->keyframe_index.entry_count = state->array_count;
    if (state->flags == FLVD_META_INDEX_SEEN)
        state->flags = 0;
}

// Inside "keyframes", records the position of the first element of the array that follows the key.
void FLVD_NoteArray(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t seen, int64_t* offset)
{
    if ((state->flags & FLVD_META_IN_KEYFRAMES) == 0)
        return;
    const int64_t position = FLVD_FioTell(ctx->cur_reader);
    if (position < 0)
        return;
    state->flags |= seen;
    *offset = position + FLVD_META_ARRAY_HEADER;
    state->array_count = 0;
}

} // namespace

void FLVD_AssignPendingKey(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const double number = FLVD_SlotNumber(state);
    switch (state->pending_key) {
    case FLVD_META_KEY_TIMES:
    case FLVD_META_KEY_FILEPOSITIONS:
        FLVD_AssignEntryCount(ctx, state);
        break;
    // Pixels; muxers write them as doubles, as AMF0 has no integers.
    case FLVD_META_KEY_WIDTH:
        ctx->video_info.width = FLVD_DoubleToU32(number);
        break;
    case FLVD_META_KEY_HEIGHT:
        ctx->video_info.height = FLVD_DoubleToU32(number);
        break;
    case FLVD_META_KEY_FILESIZE:
        FLVD_AssignFileSize(ctx, FLVD_DoubleToU32(number));
        break;
    case FLVD_META_KEY_FRAMERATE:
        ctx->video_info.frame_rate = FLVD_DoubleToU32(number * FLVD_META_FRAME_RATE_UNIT);
        break;
    // Seconds in the file.
    case FLVD_META_KEY_AUDIODELAY:
        ctx->audio_delay_ms = FLVD_SecondsToMs(number);
        break;
    // kbit/s; the sample rate is in Hz and the sample size in bits.
    case FLVD_META_KEY_AUDIODATARATE:
        ctx->audio_info.data_rate = FLVD_DoubleToU32(number);
        break;
    case FLVD_META_KEY_AUDIOSAMPLERATE:
        ctx->audio_info.sample_rate = FLVD_DoubleToU32(number);
        break;
    case FLVD_META_KEY_AUDIOSAMPLESIZE:
        ctx->audio_info.sample_size = FLVD_DoubleToU32(number);
        break;
    case FLVD_META_KEY_LASTKEYFRAMELOCATION:
        ctx->last_keyframe_pos = FLVD_DoubleToI64(number);
        break;
    case FLVD_META_KEY_LASTKEYFRAMETIMESTAMP:
        ctx->last_keyframe_ms = FLVD_SecondsToMs(number);
        ctx->video_info.last_key_time_ms = ctx->last_keyframe_ms;
        break;
    default:
        break;
    }
    state->pending_key = FLVD_META_KEY_NONE;
}

void FLVD_MeetKey(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t key)
{
    if (key == FLVD_META_KEY_NONE) {
        FLVD_AssignPendingKey(ctx, state);
        return;
    }
    state->pending_key = key;
    if (key == FLVD_META_KEY_TIMES) {
        FLVD_NoteArray(ctx, state, FLVD_META_TIMES_SEEN, &ctx->keyframe_index.times_offset);
    } else if (key == FLVD_META_KEY_FILEPOSITIONS) {
        FLVD_NoteArray(ctx, state, FLVD_META_POSITIONS_SEEN, &ctx->keyframe_index.positions_offset);
    } else if (key == FLVD_META_KEY_KEYFRAMES) {
        state->flags |= FLVD_META_IN_KEYFRAMES;
        ctx->keyframe_index.entry_count = UINT32_MAX; // lowered to the size of the smaller array
    }
}
