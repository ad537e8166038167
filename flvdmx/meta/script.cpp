// Script data: parses AMF0 values ("Action Message Format, AMF 0") and takes sixteen known properties, at any
// depth and whatever the script object is called, into the instance and its stream descriptions.
//
// Sizes are claims of the file: a value may not begin behind the payload, containers nest to a bound, and every loop
// consumes at least a byte a turn.

#include "flvdmx/common/bytes.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/flvdmx.h"

#include <cstring>
#include <iterator>

namespace {

constexpr uint32_t FLVD_META_CONTAINERS_MAX = 64;
constexpr uint32_t FLVD_META_SIZE_MAX = 0x7FFFFFFF; // results are signed
constexpr uint32_t FLVD_META_TEXT_MAX = 255;        // longer keys and texts are passed unread
constexpr uint32_t FLVD_META_DATE_SIZE = 10;        // double and time zone
constexpr uint32_t FLVD_META_END_SIZE = 3;          // 00 00 09
constexpr uint32_t FLVD_META_END = 0x000009;
constexpr uint32_t FLVD_META_ARRAY_HEADER = 5; // type marker and count

constexpr double FLVD_META_FRAME_RATE_UNIT = 1000.0; // frame_rate counts thousandths of a frame a second

// Flags of a parse.
constexpr uint32_t FLVD_META_IN_KEYFRAMES = 0x10;
constexpr uint32_t FLVD_META_TIMES_SEEN = 0x20;
constexpr uint32_t FLVD_META_POSITIONS_SEEN = 0x40;
constexpr uint32_t FLVD_META_INDEX_SEEN = FLVD_META_IN_KEYFRAMES | FLVD_META_TIMES_SEEN | FLVD_META_POSITIONS_SEEN;

enum : uint32_t {
    FLVD_AMF_BOOLEAN = 1,
    FLVD_AMF_STRING = 2,
    FLVD_AMF_OBJECT = 3,
    FLVD_AMF_MOVIE_CLIP = 4,
    FLVD_AMF_REFERENCE = 7,
    FLVD_AMF_ECMA_ARRAY = 8,
    FLVD_AMF_STRICT_ARRAY = 10,
    FLVD_AMF_DATE = 11,
    FLVD_AMF_LONG_STRING = 12
};

// The index of a key in the table is its identity.
enum : uint32_t {
    FLVD_META_KEY_TIMES,
    FLVD_META_KEY_WIDTH,
    FLVD_META_KEY_HEIGHT,
    FLVD_META_KEY_DURATION,
    FLVD_META_KEY_FILESIZE,
    FLVD_META_KEY_FRAMERATE,
    FLVD_META_KEY_KEYFRAMES,
    FLVD_META_KEY_AUDIODELAY,
    FLVD_META_KEY_AUDIODATARATE,
    FLVD_META_KEY_FILEPOSITIONS,
    FLVD_META_KEY_LASTTIMESTAMP,
    FLVD_META_KEY_TOTALDURATION,
    FLVD_META_KEY_AUDIOSAMPLERATE,
    FLVD_META_KEY_AUDIOSAMPLESIZE,
    FLVD_META_KEY_LASTKEYFRAMELOCATION,
    FLVD_META_KEY_LASTKEYFRAMETIMESTAMP,
    FLVD_META_KEY_NONE
};

struct flvd_meta_key_t {
    uint32_t length;
    const char* name;
};

// Sorted by length; the last entry ends every search.
constexpr flvd_meta_key_t g_flvd_metaKeyTable[] = {
    {5, "times"},
    {5, "width"},
    {6, "height"},
    {8, "duration"},
    {8, "filesize"},
    {9, "framerate"},
    {9, "keyframes"},
    {10, "audiodelay"},
    {13, "audiodatarate"},
    {13, "filepositions"},
    {13, "lasttimestamp"},
    {13, "totalduration"},
    {15, "audiosamplerate"},
    {15, "audiosamplesize"},
    {20, "lastkeyframelocation"},
    {21, "lastkeyframetimestamp"},
    {0, nullptr},
};
static_assert(std::size(g_flvd_metaKeyTable) == FLVD_META_KEY_NONE + 1, "one entry a key, and the end");

// What comparing four letters at a time takes for granted.
constexpr bool FLVD_AreKeysLetters()
{
    for (const flvd_meta_key_t& key : g_flvd_metaKeyTable)
        for (uint32_t i = 0; i < key.length; ++i)
            if (key.length < 4 || key.name[i] < 'a' || key.name[i] > 'z')
                return false;
    return true;
}
static_assert(FLVD_AreKeysLetters(), "at least four small letters each");

constexpr uint32_t FLVD_META_KEY_LENGTH_MAX = 21;

// First entry of each length.
struct flvd_meta_first_t {
    uint8_t index[FLVD_META_KEY_LENGTH_MAX + 1];
};

constexpr flvd_meta_first_t FLVD_MetaFirstKeys()
{
    flvd_meta_first_t first = {};
    for (uint32_t length = 0; length <= FLVD_META_KEY_LENGTH_MAX; ++length) {
        uint8_t index = 0;
        while (index < FLVD_META_KEY_NONE && g_flvd_metaKeyTable[index].length != length)
            ++index;
        first.index[length] = index;
    }
    return first;
}

constexpr flvd_meta_first_t g_flvd_metaFirstKey = FLVD_MetaFirstKeys();

flvd_mem_alloc_fn g_flvd_pfnMetaAlloc;
flvd_mem_free_fn g_flvd_pfnMetaFree;

// Parse of one payload.
struct flvd_script_state_t {
    uint32_t flags;
    uint32_t array_count;          // elements of the strict array begun last
    uint32_t value_type;           // marker of the value being parsed
    uint8_t value[sizeof(double)]; // the last number; other types overwrite its first bytes, or nothing
    uint32_t pending_key;          // the property whose value is being parsed
    uint32_t length;               // of the payload
    uint64_t consumed;             // bytes of it, and of what lies behind it when a value runs over
    uint32_t containers;           // open at present
    uint64_t kept_elements;        // of all keyframe arrays asked for so far
    uint8_t scratch[FLVD_META_TEXT_MAX];
};

double FLVD_SlotNumber(const flvd_script_state_t* state)
{
    double number = 0.0;
    std::memcpy(&number, state->value, sizeof number);
    return number;
}

// Reading. Each function fails when fewer bytes are left, and counts what it consumed.

inline const uint8_t* FLVD_ScriptPeek(flvd_ctx_t* ctx, uint32_t n)
{
    const uint8_t* bytes = nullptr;
    return FLVD_FioPeek(&bytes, n, ctx->cur_reader) == n ? bytes : nullptr;
}

// Consumes peeked bytes; they stay in the cache.
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

// Consumes a text without keeping it.
bool FLVD_ScriptPassText(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t length)
{
    if (length == 0)
        return true;
    return length <= FLVD_META_TEXT_MAX ? FLVD_ScriptRead(ctx, state, length) : FLVD_ScriptSkip(ctx, state, length);
}

// Payload bytes behind the position; a value may run over the end.
uint64_t FLVD_ScriptLeft(const flvd_script_state_t* state)
{
    return state->length > state->consumed ? state->length - state->consumed : 0;
}

bool FLVD_KeepsIndex(const flvd_ctx_t* ctx)
{
    return (ctx->options & (FLVD_OPT_PROGRESSIVE | FLVD_OPT_INDEX_IN_MEMORY)) != 0;
}

// Keys.

// Four bytes with letters made small. Other bytes change as well, but none becomes a letter that was not one.
uint32_t FLVD_SmallLetters(const void* text)
{
    uint32_t letters = 0;
    std::memcpy(&letters, text, sizeof letters);
    return letters | 0x20202020;
}

// True when a key of the name's length is the name in any case. Four letters at a time, the last four perhaps again.
bool FLVD_IsKey(const uint8_t* key, const flvd_meta_key_t& known)
{
    const uint32_t last = known.length - 4;
    uint32_t i = 0;
    while (i < last && FLVD_SmallLetters(key + i) == FLVD_SmallLetters(known.name + i))
        i += 4;
    return i >= last && FLVD_SmallLetters(key + last) == FLVD_SmallLetters(known.name + last);
}

// Index of the key of this length, 1 or more; FLVD_META_KEY_NONE when there is none.
uint32_t FLVD_FindKey(const uint8_t* key, uint32_t length)
{
    if (length > FLVD_META_KEY_LENGTH_MAX)
        return FLVD_META_KEY_NONE;
    for (uint32_t index = g_flvd_metaFirstKey.index[length]; g_flvd_metaKeyTable[index].length == length; ++index)
        if (FLVD_IsKey(key, g_flvd_metaKeyTable[index]))
            return index;
    return FLVD_META_KEY_NONE;
}

void FLVD_AssignFileSize(flvd_ctx_t* ctx, uint32_t size)
{
    if (ctx->file_size == 0)
        ctx->file_size = size;
    else if (ctx->file_size < int64_t{size})
        ctx->file_shorter_than_meta = 1;
}

void FLVD_AssignEntryCount(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    if (state->array_count < ctx->keyframe_index.entry_count)
        ctx->keyframe_index.entry_count = state->array_count;
    if (state->flags == FLVD_META_INDEX_SEEN)
        state->flags = 0;
}

// Gives the pending property the number in the slot, whatever type its value had.
void FLVD_AssignPendingKey(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const double number = FLVD_SlotNumber(state);
    switch (state->pending_key) {
    case FLVD_META_KEY_TIMES:
    case FLVD_META_KEY_FILEPOSITIONS:
        FLVD_AssignEntryCount(ctx, state);
        break;
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
    case FLVD_META_KEY_AUDIODELAY:
        ctx->audio_delay_ms = FLVD_SecondsToMs(number);
        break;
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

// Inside "keyframes", remembers where the array behind the key has its first element.
void FLVD_NoteArray(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t seen, int64_t* offset)
{
    if ((state->flags & FLVD_META_IN_KEYFRAMES) == 0)
        return;
    const int64_t position = __FLV_DMX__fioTell64(ctx->cur_reader);
    if (position < 0)
        return;
    state->flags |= seen;
    *offset = position + FLVD_META_ARRAY_HEADER;
    state->array_count = 0;
}

// What meeting a key does before its value is parsed. An unknown key inside a known property ends it: the property
// takes the number parsed last.
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
        ctx->keyframe_index.entry_count = UINT32_MAX; // each array lowers it
    }
}

// Values. Each function returns the bytes of the value, its marker included, 0 for a value that yields nothing, or -1.

int32_t FLVD_ParseScriptValue(flvd_ctx_t* ctx, flvd_script_state_t* state);

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

// Memory for a keyframe array, zeroed; null also when so many elements cannot be in the payload. All arrays together
// are bounded too: a payload full of arrays that each claim the rest of it would cost the square of its size.
void* FLVD_AllocateArray(flvd_script_state_t* state, uint32_t count, uint32_t element)
{
    if (count > UINT32_MAX / element || count > FLVD_ScriptLeft(state))
        return nullptr;
    state->kept_elements += count;
    if (state->kept_elements > uint64_t{2} * state->length)
        return nullptr;
    const uint32_t size = count * element;
    void* const array = g_flvd_pfnMetaAlloc(size);
    if (array != nullptr)
        std::memset(array, 0, size);
    return array;
}

// Replaces a keyframe array of the instance by an empty one of `count` elements, or by none.
template <typename Element>
void FLVD_ReplaceArray(flvd_script_state_t* state, uint32_t count, uint32_t* array_count, Element** array)
{
    if (*array != nullptr)
        g_flvd_pfnMetaFree(*array);
    *array_count = 0;
    *array = static_cast<Element*>(FLVD_AllocateArray(state, count, sizeof(Element)));
    if (*array != nullptr)
        *array_count = count;
}

// Stores an element in the keyframe array that stands now: an element parsed before may have replaced it.
void FLVD_StoreElement(flvd_ctx_t* ctx, const flvd_script_state_t* state, uint32_t key, uint32_t index)
{
    flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (key == FLVD_META_KEY_TIMES && index < arrays.times_count)
        arrays.times_ms[index] = FLVD_SecondsToMs(FLVD_SlotNumber(state));
    else if (key == FLVD_META_KEY_FILEPOSITIONS && index < arrays.positions_count)
        arrays.positions[index] = FLVD_DoubleToI64(FLVD_SlotNumber(state));
}

// Begins the keyframe array that the pending property asks for. Returns its key, or none when nothing is to be kept.
uint32_t FLVD_BeginKeyframeArray(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t count)
{
    flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (!FLVD_KeepsIndex(ctx))
        return FLVD_META_KEY_NONE;
    if (state->pending_key == FLVD_META_KEY_TIMES) {
        FLVD_ReplaceArray(state, count, &arrays.times_count, &arrays.times_ms);
        return arrays.times_ms != nullptr ? FLVD_META_KEY_TIMES : FLVD_META_KEY_NONE;
    }
    if (state->pending_key == FLVD_META_KEY_FILEPOSITIONS) {
        FLVD_ReplaceArray(state, count, &arrays.positions_count, &arrays.positions);
        return arrays.positions != nullptr ? FLVD_META_KEY_FILEPOSITIONS : FLVD_META_KEY_NONE;
    }
    return FLVD_META_KEY_NONE;
}

// Not inlined: what it needs of the stack would be taken for every container that is nested in another.
[[gnu::noinline]] int32_t FLVD_ParseStrictArray(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    const uint8_t* const bytes = FLVD_ScriptTake(ctx, state, 4);
    if (bytes == nullptr)
        return -1;
    const uint32_t count = FLVD_GetBE32(bytes);
    state->array_count = count;
    const uint32_t key = FLVD_BeginKeyframeArray(ctx, state, count);
    uint32_t size = FLVD_META_ARRAY_HEADER;
    for (uint32_t i = 0; i < count; ++i) {
        const int32_t element = FLVD_ParseScriptValue(ctx, state);
        if (element < 0 || static_cast<uint32_t>(element) > FLVD_META_SIZE_MAX - size)
            return -1;
        FLVD_StoreElement(ctx, state, key, i);
        size += static_cast<uint32_t>(element);
    }
    return static_cast<int32_t>(size);
}

// How a property loop ended.
enum class FlvdLoop { AtEnd, AtEmptyKey, Failed };

// Reads a key of this length and does what meeting it does. One too long to be known is not met at all: it leaves the
// pending property as it is.
bool FLVD_ParseKey(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t length)
{
    if (length > FLVD_META_TEXT_MAX)
        return FLVD_ScriptSkip(ctx, state, length);
    if (!FLVD_ScriptRead(ctx, state, length))
        return false;
    FLVD_MeetKey(ctx, state, FLVD_FindKey(state->scratch, length));
    return true;
}

// One property whose key has this length; adds its bytes to the sum.
bool FLVD_ParseProperty(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t key_length, uint32_t* sum)
{
    if (!FLVD_ParseKey(ctx, state, key_length))
        return false;
    const int32_t value = FLVD_ParseScriptValue(ctx, state);
    if (value < 0)
        return false;
    const uint64_t total = uint64_t{*sum} + 2 + key_length + static_cast<uint32_t>(value);
    if (total > FLVD_META_SIZE_MAX)
        return false;
    *sum = static_cast<uint32_t>(total);
    FLVD_AssignPendingKey(ctx, state);
    return true;
}

// Properties up to the end marker or an empty key. An end of the data is a failure.
FlvdLoop FLVD_ParseProperties(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t* sum)
{
    for (;;) {
        const uint8_t* const bytes = FLVD_ScriptPeek(ctx, FLVD_META_END_SIZE);
        if (bytes == nullptr)
            return FlvdLoop::Failed;
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

// An object or ECMA array behind its header of so many bytes; `failed` is what a failure of it returns.
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
    if (FLVD_ScriptTake(ctx, state, 4) == nullptr) // the count is a hint
        return -1;
    return FLVD_ParsePropertyList(ctx, state, FLVD_META_ARRAY_HEADER, -1);
}

// The containers are the only values that hold values, so they bound the recursion.
int32_t FLVD_ParseContainer(flvd_ctx_t* ctx, flvd_script_state_t* state)
{
    if (state->containers == FLVD_META_CONTAINERS_MAX)
        return -1;
    ++state->containers;
    int32_t size = 0;
    if (state->value_type == FLVD_AMF_OBJECT)
        size = FLVD_ParsePropertyList(ctx, state, 1, 0); // its bytes are lost, what encloses it goes on
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
        return 0; // null, undefined, object end, and what AMF0 does not know
    }
}

// Parses values until the payload is used up or one yields nothing. Returns the bytes they occupy.
uint64_t FLVD_ParseScriptValues(flvd_ctx_t* ctx, flvd_script_state_t* state, bool* stopped)
{
    uint64_t total = 0;
    *stopped = false;
    while (!*stopped && total < state->length && __FLV_DMX__fioIsEof(ctx->cur_reader) == 0) {
        const int32_t size = FLVD_ParseScriptValue(ctx, state);
        if (size > 0)
            total += static_cast<uint32_t>(size);
        else
            *stopped = true;
    }
    return total;
}

} // namespace

void FLVD_SetCallbackforMeta(const flvd_init_t* init)
{
    g_flvd_pfnMetaAlloc = init->mem_alloc;
    g_flvd_pfnMetaFree = init->mem_free;
}

int32_t FLVD_ReadMetadata(flvd_ctx_t* ctx, uint32_t length)
{
    const int64_t start = __FLV_DMX__fioTell64(ctx->cur_reader);
    if (start < 0 || length == 0)
        return -1;
    flvd_script_state_t state = {};
    state.pending_key = FLVD_META_KEY_NONE;
    state.length = length;
    bool stopped = false;
    const uint64_t total = FLVD_ParseScriptValues(ctx, &state, &stopped);
    if (stopped || total != length || state.consumed != length) {
        const int32_t moved = __FLV_DMX__fioSeek64(ctx->cur_reader, start + length, FIO_SEEK_SET);
        if (stopped && moved != 0)
            return FLVD_ERR_END_OF_DATA;
    }
    return total > 0 ? 0 : -1;
}
