// Frame seek: chooses between the keyframe index and scanning, and seeks by the index, in memory or in the file.

#include "flvdmx/seek/seek.h"

#include "flvdmx/common/bytes.h"
#include "flvdmx/common/instance.h"
#include "flvdmx/common/sites.h"
#include "flvdmx/tag/tag.h"

#include <algorithm>

namespace {

constexpr uint32_t FLVD_INDEX_TOLERANCE_MS = 1000; // encoders write times some way off the tags'
constexpr uint32_t FLVD_INDEX_ELEMENT_SIZE = 1 + FLVD_AMF_NUMBER_SIZE;

// Failures by where the index is read from.
struct flvd_index_sites_t {
    flvd_site_t rewind;
    flvd_site_t seek;
    flvd_site_t tag_cut;
    flvd_site_t tolerance;
};

constexpr flvd_index_sites_t g_flvd_fileIndexSites = {FLVD_SITE_FILE_INDEX_REWIND, FLVD_SITE_FILE_INDEX_SEEK,
                                                      FLVD_SITE_FILE_INDEX_TAG_CUT, FLVD_SITE_FILE_INDEX_TOLERANCE};
constexpr flvd_index_sites_t g_flvd_memoryIndexSites = {FLVD_SITE_MEMORY_INDEX_REWIND, FLVD_SITE_MEMORY_INDEX_SEEK,
                                                        FLVD_SITE_MEMORY_INDEX_TAG_CUT,
                                                        FLVD_SITE_MEMORY_INDEX_TOLERANCE};

enum class FlvdChoice { Entry, Rewind, Miss };

// What the index says about a target.
struct flvd_choice_t {
    FlvdChoice what;
    uint32_t entry;
    uint32_t time;
};

// The index's times in order.
struct flvd_times_t {
    fio_file_t* file;         // read from here, unless
    const uint32_t* times_ms; // they are in memory
    uint32_t count;
    bool missing; // the element read last was not there at all
};

// An element of an AMF0 strict array: a number, which is 0.0 when its bytes are cut or missing, or none.
enum class FlvdElement { Number, MissingNumber, NotANumber };

FlvdElement FLVD_ReadNumberElement(fio_file_t* file, double* number)
{
    const uint8_t* bytes = nullptr;
    const bool there = __FLV_DMX__fioShowBytesByPtr(&bytes, 1, file) == 1;
    if (there && *bytes != FLVD_AMF_NUMBER)
        return FlvdElement::NotANumber;
    __FLV_DMX__fioSkipBytes(1, file);
    const bool whole = __FLV_DMX__fioShowBytesByPtr(&bytes, FLVD_AMF_NUMBER_SIZE, file) == FLVD_AMF_NUMBER_SIZE;
    *number = whole ? FLVD_GetDouble(bytes) : 0.0;
    __FLV_DMX__fioSkipBytes(FLVD_AMF_NUMBER_SIZE, file);
    return there ? FlvdElement::Number : FlvdElement::MissingNumber;
}

// Time of entry *i, the next one. False when the array ends there. After two elements that are not there none of the
// others is: the last one stands for them all, or a count that lies would cost a read for each.
bool FLVD_NextTime(flvd_times_t* times, uint32_t* i, uint32_t* time)
{
    if (times->times_ms != nullptr) {
        *time = times->times_ms[*i];
        return true;
    }
    double seconds = 0.0;
    const FlvdElement element = FLVD_ReadNumberElement(times->file, &seconds);
    if (element == FlvdElement::NotANumber)
        return false;
    const bool missing = element == FlvdElement::MissingNumber;
    if (missing && times->missing)
        *i = times->count - 1;
    times->missing = missing;
    *time = FLVD_SecondsToMs(seconds);
    return true;
}

// The choice rule of both kinds of index: the first entry at or above the target decides.
flvd_choice_t FLVD_ChooseEntry(flvd_times_t times, uint32_t target, bool backward)
{
    uint32_t before = 0;
    uint32_t i = 0;
    for (; i < times.count; ++i) {
        uint32_t time = 0;
        if (!FLVD_NextTime(&times, &i, &time))
            break; // the entries before it are the whole index
        const bool exact = time == target && i != 0;
        if (time >= target && (!backward || exact))
            return {FlvdChoice::Entry, i, time};
        if (time >= target)
            break;
        before = time;
    }
    if (!backward)
        return {FlvdChoice::Miss, 0, 0};
    return i != 0 ? flvd_choice_t{FlvdChoice::Entry, i - 1, before} : flvd_choice_t{FlvdChoice::Rewind, 0, 0};
}

int32_t FLVD_RewindByIndex(flvd_ctx_t* ctx, uint32_t* result, flvd_site_t site)
{
    *result = ctx->first_ts;
    return FLVD_SeekToFirstTag(ctx, ctx->main_reader) == 0 ? 0 : FLVD_Fail(ctx, site);
}

// Moves to a keyframe's position and takes the timestamp there, which must be near the index's: the only proof that the
// index belongs to the file.
int32_t FLVD_LandOnEntry(flvd_ctx_t* ctx, int64_t position, uint32_t expected, uint32_t* result,
                         const flvd_index_sites_t& sites)
{
    if (__FLV_DMX__fioSeek64(ctx->main_reader, position, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, sites.seek);
    const uint8_t* bytes = nullptr;
    if (__FLV_DMX__fioShowBytesByPtr(&bytes, FLVD_TAG_HEADER_SIZE, ctx->main_reader) < FLVD_TAG_HEADER_SIZE)
        return FLVD_Fail(ctx, sites.tag_cut);
    const uint32_t timestamp = FLVD_TagTimestamp(bytes);
    if (FLVD_TimeDistance(timestamp, expected) > FLVD_INDEX_TOLERANCE_MS)
        return FLVD_Fail(ctx, sites.tolerance);
    *result = timestamp;
    return 0;
}

// Entries that both arrays in memory have.
uint32_t FLVD_EntriesInMemory(const flvd_ctx_t* ctx)
{
    const flvd_keyframe_arrays_t& arrays = ctx->keyframe_arrays;
    if (!FLVD_IsIndexInMemory(ctx))
        return 0;
    return std::min({ctx->keyframe_index.entry_count, arrays.times_count, arrays.positions_count});
}

int32_t FLVD_RunIndexSeekInMemory(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, bool backward)
{
    const flvd_times_t times = {nullptr, ctx->keyframe_arrays.times_ms, FLVD_EntriesInMemory(ctx), false};
    const flvd_choice_t choice = FLVD_ChooseEntry(times, target, backward);
    if (choice.what == FlvdChoice::Miss)
        return FLVD_ERR_END_OF_DATA;
    if (choice.what == FlvdChoice::Rewind)
        return FLVD_RewindByIndex(ctx, result, g_flvd_memoryIndexSites.rewind);
    return FLVD_LandOnEntry(ctx, ctx->keyframe_arrays.positions[choice.entry], choice.time, result,
                            g_flvd_memoryIndexSites);
}

// Reads the position of an entry from the file. False on failure, recorded.
bool FLVD_ReadEntryPosition(flvd_ctx_t* ctx, uint32_t entry, int64_t* position)
{
    fio_file_t* const file = ctx->main_reader;
    const int64_t element = ctx->keyframe_index.positions_offset + int64_t{FLVD_INDEX_ELEMENT_SIZE} * entry;
    if (__FLV_DMX__fioSeek64(file, element, FIO_SEEK_SET) != 0) {
        FLVD_Record(ctx, FLVD_SITE_FILE_INDEX_POSITIONS_SEEK);
        return false;
    }
    double number = 0.0;
    if (FLVD_ReadNumberElement(file, &number) == FlvdElement::NotANumber) {
        FLVD_Record(ctx, FLVD_SITE_FILE_INDEX_POSITION_TYPE);
        return false;
    }
    *position = FLVD_DoubleToI64(number);
    return true;
}

int32_t FLVD_RunIndexSeekFromFile(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, bool backward)
{
    fio_file_t* const file = ctx->main_reader;
    const flvd_keyframe_index_t& index = ctx->keyframe_index;
    if (index.entry_count != 0 && __FLV_DMX__fioSeek64(file, index.times_offset, FIO_SEEK_SET) != 0)
        return FLVD_Fail(ctx, FLVD_SITE_FILE_INDEX_TIMES_SEEK);
    const flvd_choice_t choice = FLVD_ChooseEntry({file, nullptr, index.entry_count, false}, target, backward);
    if (choice.what == FlvdChoice::Miss)
        return FLVD_ERR_END_OF_DATA;
    if (choice.what == FlvdChoice::Rewind)
        return FLVD_RewindByIndex(ctx, result, g_flvd_fileIndexSites.rewind);
    int64_t position = 0;
    if (!FLVD_ReadEntryPosition(ctx, choice.entry, &position))
        return -1;
    return FLVD_LandOnEntry(ctx, position, choice.time, result, g_flvd_fileIndexSites);
}

} // namespace

int32_t FLVD_RunFrameSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream, uint32_t direction)
{
    const bool backward = direction == FLVD_DIRECTION_BACKWARD;
    if (stream != FLVD_STREAM_VIDEO)
        return FLVD_RunAudioScanSeek(ctx, target, result, direction);
    if (ctx->seek_method == FLVD_SEEK_BY_SCAN)
        return FLVD_RunVideoScanSeek(ctx, target, result, direction);
    if (ctx->seek_method != FLVD_SEEK_BY_INDEX)
        return FLVD_Fail(ctx, FLVD_SITE_SEEK_METHOD);
    const bool memory = (ctx->options & FLVD_OPT_INDEX_IN_MEMORY) != 0;
    return memory ? FLVD_RunIndexSeekInMemory(ctx, target, result, backward)
                  : FLVD_RunIndexSeekFromFile(ctx, target, result, backward);
}

int32_t FLVD_RunFrameSeekProgressive(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                     uint32_t direction)
{
    if (stream != FLVD_STREAM_VIDEO)
        return -1;
    return FLVD_RunIndexSeekInMemory(ctx, target, result, direction == FLVD_DIRECTION_BACKWARD);
}
