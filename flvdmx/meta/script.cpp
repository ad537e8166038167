// Script data: parses AMF0 values ("Action Message Format, AMF 0") and stores sixteen known properties in the instance
// and its stream descriptions. It takes them at any depth, whatever the name of the script object.
//
// No size in the file is trusted: a value may not start past the payload, the nesting depth is bounded, and every loop
// consumes at least one byte per iteration.

#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/amf.h"
#include "flvdmx/meta/keyframe_index.h"
#include "flvdmx/meta/keys.h"
#include "flvdmx/meta/meta.h"

namespace {

// Bounds the stack: each level of nesting is a level of recursion. Real metadata has two or three.
constexpr uint32_t FLVD_META_CONTAINERS_MAX = 64;
constexpr uint32_t FLVD_META_SIZE_MAX = 0x7FFFFFFF; // sizes are returned as int32_t
constexpr uint32_t FLVD_META_DATE_SIZE = 10;        // a double and the time zone
constexpr uint32_t FLVD_META_END_SIZE = 3;          // 00 00 09
constexpr uint32_t FLVD_META_END = 0x000009;

// Reading. Each function fails when fewer bytes are left; those that consume bytes count them.

inline const uint8_t* FLVD_ScriptPeek(flvd_ctx_t* ctx, uint32_t n)
{
    const uint8_t* bytes = nullptr;
    return FLVD_FioPeek(&bytes, n, ctx->cur_reader) == n ? bytes : nullptr;
}

// Consumes bytes that were peeked at. They stay in the cache until the next read.
inline void FLVD_ScriptConsume(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t n)
{
    FLVD_FioDropBits(ctx->cur_reader);
    FLVD_FioConsume(ctx->cur_reader, n);
    state->consumed += n;
}

inline const uint8_t* FLVD_ScriptTake(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t n)
{
    const uint8_t* const bytes = FLVD_ScriptPeek(ctx, n);
    if (bytes != nullptr)
        FLVD_ScriptConsume(ctx, state, n);
    return bytes;
}

bool FLVD_ScriptSkip(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t n)
{
    const uint32_t skipped = FLVD_FioSkip(n, ctx->cur_reader);
    state->consumed += skipped;
    return skipped == n;
}

bool FLVD_ScriptRead(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t n)
{
    const uint32_t read = FLVD_FioReadBytes(ctx->cur_reader, state->scratch, n);
    state->consumed += read;
    return read == n;
}

// Consumes a string without keeping it. Short strings are read into the scratch buffer, because skipping past the
// cached bytes would be a seek.
bool FLVD_ScriptPassText(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t length)
{
    if (length == 0)
        return true;
    return length <= FLVD_META_TEXT_MAX ? FLVD_ScriptRead(ctx, state, length) : FLVD_ScriptSkip(ctx, state, length);
}

// Payload bytes left. A value may run past the payload; then there are none.
uint64_t FLVD_ScriptLeft(const flvd_script_state_t* state)
{
    return state->length > state->consumed ? state->length - state->consumed : 0;
}

// Values. Each function returns the size of the value with its marker, 0 for a value without content, or -1 on failure.

int32_t FLVD_ParseScriptValue(flvd_ctx_t* ctx, flvd_script_state_t* state);

// The value stays in state->value, as the bytes of a double, until the key that it belongs to is assigned.
int32_t FLVD_ParseNumber(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, FLVD_AMF_NUMBER_SIZE);
    if (bytes == nullptr)
        return -1;
    const double number = FLVD_GetDouble(bytes);
    std::memcpy(state->value, &number, sizeof number);
    return 1 + FLVD_AMF_NUMBER_SIZE;
}

int32_t FLVD_ParseBoolean(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 1);
    if (bytes == nullptr)
        return -1;
    state->value[0] = *bytes;
    return 1 + 1;
}

// A reference to an earlier object is not followed. Like a boolean, it only leaves its bytes in the value slot.
int32_t FLVD_ParseReference(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 2);
    if (bytes == nullptr)
        return -1;
    const auto reference = static_cast<uint16_t>(FLVD_GetBE16(bytes));
    std::memcpy(state->value, &reference, sizeof reference);
    return 1 + 2;
}

int32_t FLVD_ParseString(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 2);
    if (bytes == nullptr)
        return -1;
    const uint32_t length = FLVD_GetBE16(bytes);
    return FLVD_ScriptPassText(ctx, state, length) ? static_cast<int32_t>(1 + 2 + length) : -1;
}

int32_t FLVD_ParseLongString(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 4);
    if (bytes == nullptr)
        return -1;
    const uint32_t length = FLVD_GetBE32(bytes);
    if (length > FLVD_META_SIZE_MAX - (1 + 4))
        return -1;
    return FLVD_ScriptPassText(ctx, state, length) ? static_cast<int32_t>(1 + 4 + length) : -1;
}

int32_t FLVD_ParseDate(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    return FLVD_ScriptSkip(ctx, state, FLVD_META_DATE_SIZE) ? static_cast<int32_t>(1 + FLVD_META_DATE_SIZE) : -1;
}

// Allocates the keyframe array for the pending property. None when that is no index array, when the index is not kept
// in memory, or when the payload cannot hold `count` elements. The sum over all arrays is bounded too, because a
// payload full of arrays that each claim the rest of it would cost quadratic time.
FlvdArray FLVD_BeginKeyframeArray(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t count)
{
    const bool times = state->pending_key == FLVD_META_KEY_TIMES;
    const bool kept = (ctx->options & (FLVD_OPT_PROGRESSIVE | FLVD_OPT_INDEX_IN_MEMORY)) != 0;
    if (!kept || (!times && state->pending_key != FLVD_META_KEY_FILEPOSITIONS))
        return FlvdArray::None;
    const bool refused = count > FLVD_ScriptLeft(state) || state->kept_elements + count > uint64_t{2} * state->length;
    if (!refused)
        state->kept_elements += count;
    return FLVD_ReplaceArray(ctx, times ? FlvdArray::Times : FlvdArray::Positions, count, refused);
}

// Not inlined, so that its stack frame is not part of every nested container's.
[[gnu::noinline]] int32_t FLVD_ParseStrictArray(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 4);
    if (bytes == nullptr)
        return -1;
    const uint32_t count = FLVD_GetBE32(bytes);
    state->array_count = count;
    const FlvdArray array = FLVD_BeginKeyframeArray(ctx, state, count);
    // The count is not trusted as a size: the loop ends at the first element that the payload does not have.
    uint32_t size = FLVD_META_ARRAY_HEADER;
    for (uint32_t i = 0; i < count; ++i) {
        const int32_t element = FLVD_ParseScriptValue(ctx, state);
        if (element < 0 || static_cast<uint32_t>(element) > FLVD_META_SIZE_MAX - size)
            return -1;
        FLVD_StoreElement(ctx, array, i, FLVD_SlotNumber(state));
        size += static_cast<uint32_t>(element);
    }
    return static_cast<int32_t>(size);
}

// How a property loop ended.
enum class FlvdLoop { AtEnd, AtEmptyKey, Failed };

// Reads and handles a key. A key too long to be a known one is skipped, and leaves the pending property unchanged.
bool FLVD_ParseKey(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t length)
{
    if (length > FLVD_META_TEXT_MAX)
        return FLVD_ScriptSkip(ctx, state, length);
    if (!FLVD_ScriptRead(ctx, state, length))
        return false;
    FLVD_MeetKey(ctx, state, FLVD_FindKey(state->scratch, length));
    return true;
}

// Parses one property and adds its size to the sum.
bool FLVD_ParseProperty(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t key_length, uint32_t* sum)
{
    if (!FLVD_ParseKey(ctx, state, key_length))
        return false;
    const int32_t value = FLVD_ParseScriptValue(ctx, state);
    if (value < 0)
        return false;
    // Length field, key and value, summed in 64 bits so that no size can wrap around.
    const uint64_t total = uint64_t{*sum} + 2 + key_length + static_cast<uint32_t>(value);
    if (total > FLVD_META_SIZE_MAX)
        return false;
    *sum = static_cast<uint32_t>(total);
    FLVD_AssignPendingKey(ctx, state);
    return true;
}

// Parses properties up to the end marker or an empty key. Reaching the end of the data is a failure.
FlvdLoop FLVD_ParseProperties(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t* sum)
{
    for (;;) {
        const uint8_t* const bytes = FLVD_ScriptPeek(ctx, FLVD_META_END_SIZE);
        if (bytes == nullptr)
            return FlvdLoop::Failed;
        // SCRIPTDATAOBJECTEND: an empty key, then the marker of an object end. An empty key with any other value ends
        // the object too, but is left to the container.
        if (FLVD_GetBE24(bytes) == FLVD_META_END) {
            FLVD_ScriptConsume(ctx, state, FLVD_META_END_SIZE);
            return FlvdLoop::AtEnd;
        }
        const uint32_t key_length = FLVD_GetBE16(bytes);
        if (key_length == 0)
            return FlvdLoop::AtEmptyKey;
        FLVD_ScriptConsume(ctx, state, 2);
        if (!FLVD_ParseProperty(ctx, state, key_length, sum))
            return FlvdLoop::Failed;
    }
}

// Parses an object or ECMA array after its header, which has `header` bytes. Returns `failed` on failure.
int32_t FLVD_ParsePropertyList(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t header, int32_t failed)
{
    uint32_t sum = 0;
    const FlvdLoop loop = FLVD_ParseProperties(ctx, state, &sum);
    if (loop == FlvdLoop::Failed)
        return failed;
    const uint32_t around = header + (loop == FlvdLoop::AtEnd ? FLVD_META_END_SIZE : 0);
    return sum > FLVD_META_SIZE_MAX - around ? failed : static_cast<int32_t>(around + sum);
}

int32_t FLVD_ParseEcmaArray(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    // ECMAArrayLength. Many muxers write 0 or an estimate, so the end marker decides.
    if (FLVD_ScriptTake(ctx, state, 4) == nullptr)
        return -1;
    return FLVD_ParsePropertyList(ctx, state, FLVD_META_ARRAY_HEADER, -1);
}

// Only containers hold other values, so bounding their depth bounds the recursion.
int32_t FLVD_ParseContainer(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    if (state->containers == FLVD_META_CONTAINERS_MAX)
        return -1;
    ++state->containers;
    int32_t size = 0;
    if (state->value_type == FLVD_AMF_OBJECT)
        size = FLVD_ParsePropertyList(ctx, state, 1, 0); // a failed object counts as empty; its container continues
    else if (state->value_type == FLVD_AMF_ECMA_ARRAY)
        size = FLVD_ParseEcmaArray(ctx, state);
    else
        size = FLVD_ParseStrictArray(ctx, state);
    --state->containers;
    return size;
}

int32_t FLVD_ParseScriptValue(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    if (FLVD_ScriptLeft(state) == 0)
        return -1;
    const uint8_t* const marker = FLVD_ScriptTake(ctx, state, 1);
    if (marker == nullptr)
        return -1;
    state->value_type = *marker;
    switch (state->value_type) {
    case FLVD_AMF_NUMBER:
        return FLVD_ParseNumber(ctx, state);
    case FLVD_AMF_BOOLEAN:
        return FLVD_ParseBoolean(ctx, state);
    case FLVD_AMF_STRING:
    case FLVD_AMF_MOVIE_CLIP:
        return FLVD_ParseString(ctx, state);
    case FLVD_AMF_REFERENCE:
        return FLVD_ParseReference(ctx, state);
    case FLVD_AMF_OBJECT:
    case FLVD_AMF_ECMA_ARRAY:
    case FLVD_AMF_STRICT_ARRAY:
        return FLVD_ParseContainer(ctx, state);
    case FLVD_AMF_DATE:
        return FLVD_ParseDate(ctx, state);
    case FLVD_AMF_LONG_STRING:
        return FLVD_ParseLongString(ctx, state);
    default:
        return 0; // null, undefined, object end, and markers unknown to AMF0
    }
}

// Parses values until the payload is used up or a value fails or has no content. Script data is a name and a value, but
// this takes any sequence of values, as some muxers write more than one object. Returns the size of the values.
uint64_t FLVD_ParseScriptValues(flvd_ctx_t* ctx, flvd_script_state_t* state, bool* stopped)
{
    uint64_t total = 0;
    *stopped = false;
    while (!*stopped && total < state->length && !FLVD_FioAtEnd(ctx->cur_reader)) {
        const int32_t size = FLVD_ParseScriptValue(ctx, state);
        if (size > 0)
            total += static_cast<uint32_t>(size);
        else
            *stopped = true;
    }
    return total;
}

} // namespace

int32_t FLVD_ReadMetadata(flvd_ctx_t* ctx, uint32_t length)
{
    const int64_t start = FLVD_FioTell(ctx->cur_reader);
    if (start < 0 || length == 0)
        return -1;
    flvd_script_state_t state = {};
    state.pending_key = FLVD_META_KEY_NONE;
    state.length = length;
    bool stopped = false;
    const uint64_t total = FLVD_ParseScriptValues(ctx, &state, &stopped);
    // Whatever was parsed, leave the reader after the payload: values may have ended early or run past it. The seek is
    // spared in the usual case.
    if (stopped || total != length || state.consumed != length) {
        const int32_t moved = __FLV_DMX__fioSeek64(ctx->cur_reader, start + length, FIO_SEEK_SET);
        if (stopped && moved != 0)
            return FLVD_ERR_END_OF_DATA;
    }
    return total > 0 ? 0 : -1;
}
