// Forward navigation: resynchronising after damage, searching for a tag, stepping to the next tag.
//
// A search alternates between two steps: examine the header at the position, and if that is not the tag to return, move
// on. After a valid tag the next header is known to start where this one ends. After anything else the next plausible
// header is searched byte by byte. Three budgets make every search end: bytes crossed, failed checks, and the
// requirement that the position advances.

#include "flvdmx/tag/search.h"

#include <algorithm>

namespace {

// Bytes that a resynchronisation with an empty cache reads first, however large the cache is.
constexpr uint32_t FLVD_FIRST_LOOK = 4096;

// The trusting search checks once per this many skipped tags that the position advances. It has no budget for such
// tags, so without the check a host whose seeks do not move could keep it running forever.
constexpr uint32_t FLVD_TAGS_PER_POSITION = 0x1000;

// Internal results of a search, in addition to those of the navigation functions.
constexpr int32_t FLVD_SEARCH_ON = 1;    // continue after this tag
constexpr int32_t FLVD_BUDGET_SPENT = 2; // no tag within the budget
constexpr int32_t FLVD_UNCHECKED = 3;    // success, but the back-pointer was not checked

// One search for a tag.
struct flvd_search_t {
    flvd_ctx_t* ctx;
    fio_file_t* file;
    flvd_tag_rules_t rules;
    uint32_t wanted;
    int32_t budget;                   // bytes that resynchronisation may still cross
    int64_t position;                 // result of the last tell
    bool data_ended;                  // the last resynchronisation ended at the end of the data, not of its budget
    uint32_t* checks_left;            // back-pointer checks that may still fail
    const flvd_frame_search_t* frame; // set for a frame request, which may take tags unchecked
};

flvd_search_t FLVD_MakeSearch(flvd_ctx_t* ctx, fio_file_t* file, uint32_t wanted, int64_t position,
                              uint32_t* checks_left)
{
    return {ctx, file, FLVD_TagRules(ctx), wanted, FLVD_RESYNC_WINDOW, position, false, checks_left, nullptr};
}

// Resynchronisation.

// Index of the first plausible header that begins in the first `starts` bytes of a window; `starts` when there is none.
uint32_t FLVD_FindCandidate(const uint8_t* window, uint32_t starts, const flvd_tag_rules_t& rules)
{
    for (uint32_t i = 0; i < starts; ++i) {
        const uint8_t type = window[i];
        if (type != FLVD_TAG_TYPE_AUDIO && type != FLVD_TAG_TYPE_VIDEO && type != FLVD_TAG_TYPE_SCRIPT)
            continue;
        if (FLVD_IsPlausibleTag(rules, FLVD_ReadTagHeader(window + i)))
            return i;
    }
    return starts;
}

// FLVD_FindNextTag with separate results for reaching the limit (FLVD_ERR_NOT_FOUND) and the end of the data
// (FLVD_ERR_END_OF_DATA).
int64_t FLVD_ScanForTag(flvd_ctx_t* ctx, fio_file_t* file, uint32_t limit)
{
    if (limit == 0)
        return FLVD_ERR_NOT_FOUND;
    if (ctx->cache_size < FLVD_TAG_PEEK_SIZE)
        return FLVD_ERR_END_OF_DATA;
    constexpr uint32_t overlap = FLVD_TAG_PEEK_SIZE - 1; // the next window repeats the last bytes of this one
    flvd_tag_rules_t rules = FLVD_TagRules(ctx);
    --rules.max_timestamp; // a timestamp equal to the ceiling is rejected here; the ceiling is never 0
    const uint32_t step = ctx->cache_size - overlap;
    const int64_t stop = int64_t{(limit - 1) / step} * step + step; // the limit, in whole windows
    // Search what is cached first: after a false header almost a whole window is, and topping it up would cost one host
    // call per false header. With an empty cache, read only a little: the next false header is often near.
    const uint32_t first = file->count >= FLVD_TAG_PEEK_SIZE ? file->count : FLVD_FIRST_LOOK;
    uint32_t size = std::min(first, ctx->cache_size);
    int64_t scanned = 0;
    while (scanned < stop) {
        const FLVD_ReadSizeGuard window_size(file, std::min(size, file->capacity), file->read_size);
        const uint8_t* window = nullptr;
        const uint32_t available = FLVD_FioPeek(&window, size, file);
        if (available < FLVD_TAG_PEEK_SIZE) // the previous window was the last, incomplete one
            return scanned < limit ? FLVD_ERR_END_OF_DATA : FLVD_ERR_NOT_FOUND;
        const auto starts = static_cast<uint32_t>(std::min<int64_t>(available - overlap, stop - scanned));
        const uint32_t found = FLVD_FindCandidate(window, starts, rules);
        FLVD_FioSkip(found, file);
        scanned += found;
        if (found < starts)
            return scanned;
        size = ctx->cache_size;
    }
    return FLVD_ERR_NOT_FOUND;
}

// Scans for the next candidate and charges the distance to the search's budget. Returns the result of the scan.
int64_t FLVD_Scan(flvd_search_t* search)
{
    const int64_t distance = FLVD_ScanForTag(search->ctx, search->file, FLVD_RESYNC_WINDOW);
    if (distance > 0)
        search->budget -= static_cast<int32_t>(std::min<int64_t>(distance, FLVD_RESYNC_WINDOW));
    return distance;
}

// Moves to the next candidate after the byte at the position. A failure uses up the budget, which ends the search.
void FLVD_Resynchronise(flvd_search_t* search)
{
    FLVD_FioSkip(1, search->file);
    const int64_t distance = FLVD_Scan(search);
    if (distance >= 0)
        return;
    search->data_ended = distance == FLVD_ERR_END_OF_DATA;
    search->budget = 0;
}

// Both searches.

// Updates the position. False when the tell fails or returns a position before the last one: a search only moves
// forward, and a host with wrong positions could keep it running forever.
bool FLVD_TakePosition(flvd_search_t* search)
{
    const int64_t position = FLVD_FioTell(search->file);
    const bool taken = position >= search->position;
    search->position = position;
    return taken;
}

// Updates the position after a tag. False also when the position has not advanced.
bool FLVD_TakeLaterPosition(flvd_search_t* search)
{
    const int64_t before = search->position;
    return FLVD_TakePosition(search) && search->position > before;
}

// Peeks at the next header. Returns 0, or the result that ends the search.
int32_t FLVD_PeekNext(const flvd_search_t* search, flvd_tag_header_t* header)
{
    if (FLVD_FioAtEnd(search->file))
        return FLVD_ERR_END_OF_DATA;
    if (search->budget <= 0 || *search->checks_left == 0)
        return FLVD_BUDGET_SPENT;
    return FLVD_PeekTagHeader(search->file, header) ? 0 : FLVD_ERR_END_OF_DATA;
}

// Converts the result of a search to that of FLVD_GetCurrTagInfo.
int32_t FLVD_TranslateSpent(const flvd_search_t* search, int32_t result)
{
    if (result != FLVD_BUDGET_SPENT)
        return result;
    return search->data_ended ? FLVD_ERR_END_OF_DATA : FLVD_ERR_NOT_FOUND;
}

// The trusting search: only headers are checked.

// Skips an unwanted tag by its size. `passed` counts such tags. Returns 0, or the result that ends the search.
int32_t FLVD_PassBySize(flvd_search_t* search, const flvd_tag_header_t& header, uint32_t* passed)
{
    const uint32_t size = header.info.data_size + FLVD_TAG_OVERHEAD;
    const bool moved = header.IsAudio() ? FLVD_FioSkip(size, search->file) == size
                                        : __FLV_DMX__fioSeek64(search->file, size, FIO_SEEK_CUR) == 0;
    if (!moved)
        return FLVD_ERR_END_OF_DATA;
    const bool goes_on = ++*passed % FLVD_TAGS_PER_POSITION != 0 || FLVD_TakeLaterPosition(search);
    return goes_on ? 0 : FLVD_ERR_NOT_FOUND;
}

// Returns 0 with the header, where the reader then stands; a navigation result; or FLVD_BUDGET_SPENT.
int32_t FLVD_SearchTrusting(flvd_search_t* search, flvd_tag_header_t* header)
{
    for (uint32_t passed = 0;;) {
        int32_t result = FLVD_PeekNext(search, header);
        if (result != 0)
            return result;
        if (!FLVD_IsPlausibleTag(search->rules, *header))
            FLVD_Resynchronise(search);
        else if (FLVD_IsWantedTag(*header, search->wanted))
            return 0;
        else
            result = FLVD_PassBySize(search, *header, &passed);
        if (result != 0)
            return result;
    }
}

// The careful search: back-pointers must agree, and the position of every tag is recorded.

// Outcome of a back-pointer check. `in_place`: the reader still stands at the tag; otherwise after the tag's data.
struct flvd_check_t {
    bool passed;
    bool in_place;
};

// Checks the back-pointer of the tag at the position, in place if the tag fits the cache.
flvd_check_t FLVD_CheckBackPointer(const flvd_search_t* search, const flvd_tag_info_t& tag)
{
    fio_file_t* const file = search->file;
    // Many muxers write a wrong size after the first script tag, because they fill that tag in at the end.
    const bool exempt = tag.type == FLVD_TAG_TYPE_SCRIPT && search->position <= search->rules.first_tag;
    const uint32_t size = tag.data_size + FLVD_TAG_OVERHEAD;
    if (size <= file->capacity && file->read_size == file->capacity) {
        const uint8_t* bytes = nullptr;
        const uint32_t first = FLVD_FioPeek(&bytes, size, file);
        if (first == size)
            return {FLVD_IsBackPointer(bytes + size - FLVD_BACK_POINTER_SIZE, tag.data_size) || exempt, true};
        // If a second peek returns no more, the data ends here. Seeking past it instead would cost a whole cache for
        // each false header near the end.
        if (FLVD_FioPeek(&bytes, size, file) == first)
            return {exempt, true};
    }
    return {FLVD_CheckPastData(file, tag.data_size) || exempt, false};
}

// Leaves a tag whose back-pointer disagrees: the search continues one byte after the tag's start. False when the reader
// cannot be moved there, since a search must not report a tag at which the reader does not stand.
bool FLVD_PassBadTag(flvd_search_t* search, bool in_place)
{
    const int64_t next = search->position + 1;
    if (in_place)
        FLVD_FioSkip(1, search->file);
    else if (__FLV_DMX__fioSeek64(search->file, next, FIO_SEEK_SET) != 0)
        return false;
    FLVD_Scan(search);
    --*search->checks_left;
    search->position = next;
    return true;
}

// Leaves a valid tag. The search continues after it with a full budget.
bool FLVD_PassGoodTag(flvd_search_t* search, bool in_place, const flvd_tag_info_t& tag)
{
    FLVD_FioSkip(in_place ? tag.data_size + FLVD_TAG_OVERHEAD : FLVD_BACK_POINTER_SIZE, search->file);
    search->budget = FLVD_RESYNC_WINDOW;
    return FLVD_TakeLaterPosition(search);
}

// Steps over a checked tag, valid or not. False ends the search with FLVD_ERR_NOT_FOUND.
bool FLVD_StepOver(flvd_search_t* search, flvd_check_t check, const flvd_tag_info_t& tag)
{
    return check.passed ? FLVD_PassGoodTag(search, check.in_place, tag) : FLVD_PassBadTag(search, check.in_place);
}

// Takes the plausible header at the position if its kind is wanted and its back-pointer agrees or may be checked later.
// Otherwise steps over it. Returns 0, FLVD_UNCHECKED, FLVD_SEARCH_ON or FLVD_ERR_NOT_FOUND.
int32_t FLVD_TakePlausible(flvd_search_t* search, const flvd_tag_header_t& header)
{
    if (!FLVD_TakePosition(search))
        return FLVD_ERR_NOT_FOUND;
    const bool wanted = FLVD_IsWantedTag(header, search->wanted);
    if (wanted && search->frame != nullptr && FLVD_IsReadBeforeCheck(*search->frame, FLVD_CheckedTag(header)))
        return FLVD_UNCHECKED;
    const flvd_check_t check = FLVD_CheckBackPointer(search, header.info);
    if (!wanted || !check.passed)
        return FLVD_StepOver(search, check, header.info) ? FLVD_SEARCH_ON : FLVD_ERR_NOT_FOUND;
    const bool on_tag = check.in_place || __FLV_DMX__fioSeek64(search->file, search->position, FIO_SEEK_SET) == 0;
    return on_tag ? 0 : FLVD_ERR_NOT_FOUND;
}

// Returns 0 or FLVD_UNCHECKED with the header, where the reader then stands; a navigation result; or FLVD_BUDGET_SPENT.
int32_t FLVD_SearchCareful(flvd_search_t* search, flvd_tag_header_t* header)
{
    for (;;) {
        int32_t result = FLVD_PeekNext(search, header);
        if (result != 0)
            return result;
        if (FLVD_IsPlausibleTag(search->rules, *header)) {
            result = FLVD_TakePlausible(search, *header);
            if (result != FLVD_SEARCH_ON)
                return result;
        } else {
            FLVD_Resynchronise(search);
            if (!FLVD_TakePosition(search))
                return FLVD_ERR_NOT_FOUND;
        }
    }
}

// FLVD_SearchCareful with the results of FLVD_FindFrameTag.
int32_t FLVD_TakeFrameTag(flvd_search_t* search, flvd_found_tag_t* tag)
{
    flvd_tag_header_t header;
    const int32_t result = FLVD_TranslateSpent(search, FLVD_SearchCareful(search, &header));
    if (result != 0 && result != FLVD_UNCHECKED)
        return result;
    *tag = FLVD_CheckedTag(header);
    tag->checked = result == 0;
    tag->start = search->position;
    tag->budget = search->budget;
    return 0;
}

// Stepping.

uint32_t FLVD_VideoKind(const flvd_tag_header_t& header, uint32_t wanted)
{
    if ((wanted & FLVD_TAG_KEYFRAME) != 0)
        return FLVD_TAG_VIDEO | FLVD_TAG_KEYFRAME;
    if ((wanted & FLVD_TAG_CONFIG) != 0 && header.IsAvc())
        return FLVD_TAG_VIDEO | FLVD_TAG_CONFIG;
    const uint32_t keyframe = header.IsKeyframe() ? FLVD_TAG_KEYFRAME : 0;
    const uint32_t config = header.IsAvcConfigOrOther() ? FLVD_TAG_CONFIG : 0;
    return FLVD_TAG_VIDEO | keyframe | config;
}

uint32_t FLVD_ForwardKind(const flvd_tag_header_t& header, uint32_t wanted)
{
    if (header.IsVideo())
        return FLVD_VideoKind(header, wanted);
    if (header.IsAudio())
        return header.IsAacConfigOrOther() ? FLVD_TAG_AUDIO | FLVD_TAG_CONFIG : FLVD_TAG_AUDIO;
    return FLVD_TAG_SCRIPT;
}

// Moves from the tag at the position to where the search for the next one starts. Returns 0, or the result of the step.
int32_t FLVD_LeaveCurrentTag(flvd_search_t* search)
{
    if (search->position == search->ctx->data_offset) { // the next tag is the first one
        FLVD_SkipFirstBackPointer(search->ctx, search->file, search->position);
        return FLVD_TakePosition(search) ? 0 : FLVD_ERR_NOT_FOUND;
    }
    flvd_tag_header_t header;
    if (!FLVD_PeekTagHeader(search->file, &header))
        return FLVD_ERR_END_OF_DATA;
    if (!FLVD_IsPlausibleTag(search->rules, header)) {
        FLVD_Resynchronise(search);
        return FLVD_TakePosition(search) ? 0 : FLVD_ERR_NOT_FOUND;
    }
    if (!FLVD_TakePosition(search))
        return FLVD_ERR_NOT_FOUND;
    const flvd_check_t check = FLVD_CheckBackPointer(search, header.info);
    return FLVD_StepOver(search, check, header.info) ? 0 : FLVD_ERR_NOT_FOUND;
}

} // namespace

// Neither is inlined: FLVD_FindFrameTag finds most frames without them and stays small, with few registers to save.
[[gnu::noinline]] int32_t FLVD_SearchFrameTag(flvd_frame_search_t* search, int64_t position, flvd_found_tag_t* tag)
{
    flvd_search_t careful = FLVD_MakeSearch(search->ctx, search->file, search->wanted, position, &search->checks_left);
    careful.frame = search;
    return FLVD_TakeFrameTag(&careful, tag);
}

[[gnu::noinline]] int32_t FLVD_FindFrameTagAfterBad(flvd_frame_search_t* search, flvd_found_tag_t* tag)
{
    flvd_search_t careful =
        FLVD_MakeSearch(search->ctx, search->file, search->wanted, tag->start, &search->checks_left);
    careful.budget = tag->budget;
    return FLVD_PassBadTag(&careful, false) ? FLVD_TakeFrameTag(&careful, tag) : FLVD_ERR_NOT_FOUND;
}

int32_t FLVD_GetCurrTagInfo(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted, int32_t verify)
{
    const int64_t position = FLVD_FioTell(file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    FLVD_SkipFirstBackPointer(ctx, file, position);
    uint32_t checks_left = FLVD_FAILED_CHECKS_MAX;
    flvd_search_t search = FLVD_MakeSearch(ctx, file, wanted, position, &checks_left);
    flvd_tag_header_t header;
    const int32_t found = verify != 0 ? FLVD_SearchCareful(&search, &header) : FLVD_SearchTrusting(&search, &header);
    const int32_t result = FLVD_TranslateSpent(&search, found);
    if (result == 0)
        *info = header.info;
    return result;
}

int32_t FLVD_FindNextTag(flvd_ctx_t* ctx, fio_file_t* file, uint32_t limit)
{
    const int64_t distance = FLVD_ScanForTag(ctx, file, limit);
    return distance < 0 || distance > INT32_MAX ? FLVD_ERR_NOT_FOUND : static_cast<int32_t>(distance);
}

int32_t FLVD_MoveToNextTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted, uint32_t* kind)
{
    if (kind != nullptr)
        *kind = 0;
    const int64_t position = FLVD_FioTell(file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    uint32_t checks_left = FLVD_FAILED_CHECKS_MAX;
    flvd_search_t search = FLVD_MakeSearch(ctx, file, wanted, position, &checks_left);
    flvd_tag_header_t header;
    int32_t result = FLVD_LeaveCurrentTag(&search);
    if (result == 0)
        result = FLVD_SearchCareful(&search, &header);
    if (result == FLVD_BUDGET_SPENT) {
        const bool ended = ctx->data_end - search.position < int64_t{FLVD_TAG_PEEK_SIZE};
        return ended ? FLVD_ERR_END_OF_DATA : FLVD_ERR_NOT_FOUND;
    }
    if (result != 0)
        return result;
    *info = header.info;
    if (kind != nullptr)
        *kind = FLVD_ForwardKind(header, wanted);
    return 0;
}
