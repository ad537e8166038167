// The keyframe index: the strict arrays "times" (seconds) and "filepositions" (bytes) of the "keyframes" object in the
// metadata. No standard defines them, but most muxers that write an index write this one.
//
// The index may be in memory, where its numbers have been converted, or only in the file, where each element is nine
// bytes: a marker and a big-endian double. Nothing in it is trusted: positions are compared with the size of the file,
// counts with what the arrays really hold, and a seek compares the time with that of the tag.

#include "flvdmx/meta/keyframe_index.h"

#include "flvdmx/common/sites.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/meta/amf.h"

#include <algorithm>
#include <cstring>

namespace {

constexpr uint32_t FLVD_ELEMENT_SIZE = 1 + FLVD_AMF_NUMBER_SIZE; // type marker and number

// Separate from the tables of the file layer, because FLVD_ReadMetadata can be used on its own. Process-wide like them.
flvd_mem_alloc_fn g_flvd_pfnMetaAlloc;
flvd_mem_free_fn g_flvd_pfnMetaFree;

// Replaces *array by one of `count` zeros, or by null when `refused`, too large or out of memory.
template <typename Element> void FLVD_Replace(Element** array, uint32_t* array_count, uint32_t count, bool refused)
{
    if (*array != nullptr)
        g_flvd_pfnMetaFree(*array);
    *array = nullptr;
    *array_count = 0;
    // The size must fit in 32 bits, since that is what mem_alloc takes.
    if (refused || count > UINT32_MAX / sizeof(Element))
        return;
    const auto size = static_cast<uint32_t>(count * sizeof(Element)); // checked above
    *array = static_cast<Element*>(g_flvd_pfnMetaAlloc(size));
    if (*array == nullptr)
        return;
    // Elements that turn out not to exist read as 0.
    std::memset(*array, 0, size);
    *array_count = count;
}

// Result of reading one element of an array in the file.
enum class FlvdElement { Number, NotANumber, Missing };

// For opening: an element of which not all nine bytes are there is missing. Only a number is consumed.
FlvdElement FLVD_ReadWholeElement(fio_file_t* file, double* number)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_ELEMENT_SIZE, file) < FLVD_ELEMENT_SIZE)
        return FlvdElement::Missing;
    if (bytes[0] != FLVD_AMF_NUMBER)
        return FlvdElement::NotANumber;
    *number = FLVD_GetDouble(bytes + 1);
    FLVD_FioSkip(FLVD_ELEMENT_SIZE, file);
    return FlvdElement::Number;
}

// For seeking: consumes the element's nine bytes whether or not they exist; an incomplete number reads as 0.0. The
// element is missing only when not even its marker exists. Something other than a number is not consumed.
FlvdElement FLVD_ReadElementOrZero(fio_file_t* file, double* number)
{
    const uint8_t* bytes = nullptr;
    const bool marked = FLVD_FioPeek(&bytes, 1, file) == 1;
    if (marked && bytes[0] != FLVD_AMF_NUMBER)
        return FlvdElement::NotANumber;
    FLVD_FioSkip(1, file);
    const bool whole = FLVD_FioPeek(&bytes, FLVD_AMF_NUMBER_SIZE, file) == FLVD_AMF_NUMBER_SIZE;
    *number = whole ? FLVD_GetDouble(bytes) : 0.0;
    FLVD_FioSkip(FLVD_AMF_NUMBER_SIZE, file);
    return marked ? FlvdElement::Number : FlvdElement::Missing;
}

// Result of reading positions in order.
struct flvd_positions_t {
    uint32_t available;
    uint32_t read; // including the one at or above the limit
    int64_t last_inside;
};

// Reads positions, from memory or through the current reader, up to and including the first one that is not below
// `limit`. Positions need not ascend in a damaged index; the first one outside ends the usable part. False when an
// array in the file is cut short.
bool FLVD_ReadPositionsBelow(const flvd_ctx_t* ctx, int64_t limit, flvd_positions_t* positions)
{
    const bool memory = FLVD_IsIndexInMemory(ctx);
    *positions = {memory ? ctx->keyframe_arrays.positions_count : ctx->keyframe_index.entry_count, 0, 0};
    while (positions->read < positions->available) {
        double number = 0.0;
        const FlvdElement element = memory ? FlvdElement::Number : FLVD_ReadWholeElement(ctx->cur_reader, &number);
        if (element != FlvdElement::Number)
            return element == FlvdElement::NotANumber;
        const int64_t position = memory ? ctx->keyframe_arrays.positions[positions->read] : FLVD_DoubleToI64(number);
        ++positions->read;
        if (position >= limit)
            return true;
        positions->last_inside = position;
    }
    return true;
}

// Unless the index is in memory, moves the current reader to its positions. Returns 0, or -1 with the failure recorded.
int32_t FLVD_GoToPositions(flvd_ctx_t* ctx, flvd_site_t site)
{
    if (FLVD_IsIndexInMemory(ctx) ||
        __FLV_DMX__fioSeek64(ctx->cur_reader, ctx->keyframe_index.positions_offset, FIO_SEEK_SET) == 0)
        return 0;
    return FLVD_Fail(ctx, site);
}

// Trims the entries past the end of the valid data, except the first of them, and returns how many remain in *count.
// An index in memory without positions keeps its entry count.
int32_t FLVD_TrimEntries(flvd_ctx_t* ctx, int64_t end, uint32_t* count)
{
    uint32_t& entry_count = ctx->keyframe_index.entry_count;
    *count = entry_count;
    // Most files are valid to their end and need no trimming.
    if (end == ctx->file_size)
        return 0;
    if (FLVD_GoToPositions(ctx, FLVD_SITE_TRIM_POSITIONS_SEEK) != 0)
        return -1;
    flvd_positions_t positions = {};
    if (end >= 1 && !FLVD_ReadPositionsBelow(ctx, end, &positions))
        return -1;
    *count = std::min(entry_count, positions.read); // the array of times may be shorter
    if (!FLVD_IsIndexInMemory(ctx) || positions.available != 0)
        entry_count = *count;
    return 0;
}

// Time of the last of the first `count` entries in memory that has a time, or 0.
uint32_t FLVD_LastTimeInMemory(const flvd_ctx_t* ctx, uint32_t count)
{
    count = std::min(count, ctx->keyframe_arrays.times_count);
    return count != 0 ? ctx->keyframe_arrays.times_ms[count - 1] : 0;
}

// Reads the times in order, because only the last usable one is wanted but an element that is not a number ends the
// array earlier.
int32_t FLVD_ReadLastTime(flvd_ctx_t* ctx, uint32_t count, uint32_t* time)
{
    *time = 0;
    if (count == 0)
        return 0;
    if (__FLV_DMX__fioSeek64(ctx->cur_reader, ctx->keyframe_index.times_offset, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_TRIM_TIMES_SEEK);
    double seconds = 0.0;
    for (uint32_t i = 0; i < count; ++i) {
        const FlvdElement element = FLVD_ReadWholeElement(ctx->cur_reader, &seconds);
        if (element == FlvdElement::Missing)
            return -1;
        if (element == FlvdElement::NotANumber)
            break;
    }
    *time = FLVD_SecondsToMs(seconds);
    return 0;
}

// Number of entries that have both a time and a position in memory. The arrays come from the file and need not have the
// same length.
uint32_t FLVD_EntriesInMemory(const flvd_ctx_t* ctx)
{
    const flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (!FLVD_IsIndexInMemory(ctx))
        return 0;
    return std::min({ctx->keyframe_index.entry_count, arrays.times_count, arrays.positions_count});
}

// Reads the times in order.
struct flvd_times_t {
    fio_file_t* file;         // source when the times are not in memory
    const uint32_t* times_ms; // in memory, or null
    uint32_t count;
    bool missing; // the last element read was missing
};

// Reads the time of entry *i, the next one. False when the array ends there. After two missing elements, skips to the
// last entry: the others are missing too, and with a wrong count each would cost a read.
bool FLVD_NextTime(flvd_times_t* times, uint32_t* i, uint32_t* time)
{
    if (times->times_ms != nullptr) {
        *time = times->times_ms[*i];
        return true;
    }
    double seconds = 0.0;
    const FlvdElement element = FLVD_ReadElementOrZero(times->file, &seconds);
    if (element == FlvdElement::NotANumber)
        return false;
    const bool missing = element == FlvdElement::Missing;
    if (missing && times->missing)
        *i = times->count - 1;
    times->missing = missing;
    *time = FLVD_SecondsToMs(seconds);
    return true;
}

} // namespace

void FLVD_SetCallbackforMeta(const flvd_init_t* init)
{
    g_flvd_pfnMetaAlloc = init->mem_alloc;
    g_flvd_pfnMetaFree = init->mem_free;
}

FlvdArray FLVD_ReplaceArray(flvd_ctx_t* ctx, FlvdArray array, uint32_t count, bool refused)
{
    flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (array == FlvdArray::Times) {
        FLVD_Replace(&arrays.times_ms, &arrays.times_count, count, refused);
        return arrays.times_ms != nullptr ? array : FlvdArray::None;
    }
    FLVD_Replace(&arrays.positions, &arrays.positions_count, count, refused);
    return arrays.positions != nullptr ? array : FlvdArray::None;
}

void FLVD_StoreElement(flvd_ctx_t* ctx, FlvdArray array, uint32_t entry, double number)
{
    flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (array == FlvdArray::Times && entry < arrays.times_count)
        arrays.times_ms[entry] = FLVD_SecondsToMs(number);
    else if (array == FlvdArray::Positions && entry < arrays.positions_count)
        arrays.positions[entry] = FLVD_DoubleToI64(number);
}

bool FLVD_IsIndexUsable(const flvd_ctx_t* ctx)
{
    const flvd_keyframe_index_t& index = ctx->keyframe_index;
    return index.times_offset != 0 && index.positions_offset != 0 && index.times_offset < ctx->file_size &&
           index.positions_offset < ctx->file_size && index.entry_count > 1;
}

int32_t FLVD_FindLastInside(flvd_ctx_t* ctx, int64_t* last, bool* all_inside)
{
    flvd_positions_t positions;
    if (FLVD_GoToPositions(ctx, FLVD_SITE_INDEX_FILE_SEEK) != 0 ||
        !FLVD_ReadPositionsBelow(ctx, ctx->file_size, &positions))
        return -1;
    *last = positions.last_inside;
    *all_inside = positions.read == positions.available;
    return 0;
}

int32_t FLVD_TrimIndex(flvd_ctx_t* ctx, int64_t end)
{
    uint32_t count = 0;
    if (FLVD_TrimEntries(ctx, end, &count) != 0)
        return -1;
    uint32_t time = 0;
    if (FLVD_IsIndexInMemory(ctx))
        time = FLVD_LastTimeInMemory(ctx, count);
    else if (FLVD_ReadLastTime(ctx, count, &time) != 0)
        return -1;
    ctx->last_keyframe_ms = time;
    ctx->video_info.last_key_time_ms = time;
    return 0;
}

flvd_choice_t FLVD_ChooseEntry(const flvd_ctx_t* ctx, FlvdIndex index, uint32_t target, bool backward)
{
    flvd_times_t times = {ctx->main_reader, nullptr, ctx->keyframe_index.entry_count, false};
    if (index == FlvdIndex::InMemory)
        times = {nullptr, ctx->keyframe_arrays.times_ms, FLVD_EntriesInMemory(ctx), false};
    uint32_t before = 0;
    uint32_t i = 0;
    for (; i < times.count; ++i) {
        uint32_t time = 0;
        if (!FLVD_NextTime(&times, &i, &time))
            break; // the index ends with the entry before it
        // Entries are expected in order of time; the first one at or after the target ends the search. A backward seek
        // to an exact time takes that entry, except the first one: it then goes to the first tag, which is the same
        // picture or earlier.
        const bool exact = time == target && i != 0;
        if (time >= target && (!backward || exact))
            return {FlvdChoice::Entry, i, time};
        if (time >= target)
            break;
        before = time;
    }
    // The target is later than all times. The reader must still end one element past them.
    double unused = 0.0;
    if (index == FlvdIndex::InFile && i != 0 && i == times.count && !times.missing)
        FLVD_ReadElementOrZero(times.file, &unused);
    if (!backward)
        return {FlvdChoice::Miss, 0, 0};
    return i != 0 ? flvd_choice_t{FlvdChoice::Entry, i - 1, before} : flvd_choice_t{FlvdChoice::Rewind, 0, 0};
}

int32_t FLVD_ReadPosition(flvd_ctx_t* ctx, FlvdIndex index, uint32_t entry, int64_t* position)
{
    if (index == FlvdIndex::InMemory) {
        *position = ctx->keyframe_arrays.positions[entry];
        return 0;
    }
    fio_file_t* const file = ctx->main_reader;
    // Elements have a fixed size, so the position of any entry is one seek away, whereas its time is only found by
    // reading all times before it.
    const int64_t element = ctx->keyframe_index.positions_offset + int64_t{FLVD_ELEMENT_SIZE} * entry;
    if (__FLV_DMX__fioSeek64(file, element, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_FILE_INDEX_POSITIONS_SEEK);
    double number = 0.0;
    if (FLVD_ReadElementOrZero(file, &number) == FlvdElement::NotANumber)
        return FLVD_Fail(ctx, FLVD_SITE_FILE_INDEX_POSITION_TYPE);
    *position = FLVD_DoubleToI64(number);
    return 0;
}
