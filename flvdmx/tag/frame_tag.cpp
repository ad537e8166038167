// Finds the tag of the next frame. This runs for every frame delivered, so the usual case (the next tag is the one
// wanted, and is cached) is decided here with a few comparisons. Everything else is left to the search in forward.cpp.

#include "flvdmx/tag/search.h"

namespace {

// True when enough of the tag at the position is cached to check its header, and the tag is plausible and wanted. Never
// true for script data: the back-pointer of the first script tag need not agree, which only the full search handles.
bool FLVD_IsNextWanted(const flvd_frame_search_t& search, flvd_tag_header_t* header)
{
    const fio_file_t* const file = search.file;
    // With a narrowed read size, as while a caller steps through tags, the full search decides.
    if (file->count < FLVD_TAG_PEEK_SIZE || file->state != FIO_STATE_READ || file->read_size != file->capacity)
        return false;
    *header = FLVD_ReadTagHeader(FLVD_FioCached(file));
    return header->info.type != FLVD_TAG_TYPE_SCRIPT && FLVD_IsPlausibleTag(FLVD_TagRules(search.ctx), *header) &&
           FLVD_IsWantedTag(*header, search.wanted);
}

// True when the whole tag at the position is cached and its back-pointer agrees.
bool FLVD_IsCachedAndValid(const fio_file_t* file, uint32_t data_size)
{
    const uint32_t size = data_size + FLVD_TAG_OVERHEAD;
    return size <= file->count && FLVD_IsBackPointer(FLVD_FioCached(file) + size - FLVD_BACK_POINTER_SIZE, data_size);
}

} // namespace

bool FLVD_CheckPastData(fio_file_t* file, uint32_t data_size)
{
    // May move past the end of the file. The peek then finds nothing, which counts as disagreeing.
    FLVD_FioSkip(data_size + FLVD_TAG_HEADER_SIZE, file);
    const uint32_t before = file->read_size;
    const FLVD_ReadSizeGuard narrow(file, before > FLVD_NARROW_READ ? FLVD_BACK_POINTER_SIZE : before, before);
    const uint8_t* bytes = nullptr;
    return FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) == FLVD_BACK_POINTER_SIZE &&
           FLVD_IsBackPointer(bytes, data_size);
}

int32_t FLVD_FindFrameTag(flvd_frame_search_t* search, flvd_found_tag_t* tag)
{
    const int64_t position = FLVD_FioTell(search->file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    FLVD_SkipFirstBackPointer(search->ctx, search->file, position);
    flvd_tag_header_t header;
    if (!FLVD_IsNextWanted(*search, &header))
        return FLVD_SearchFrameTag(search, position, tag);
    *tag = FLVD_CheckedTag(header);
    tag->checked = FLVD_IsCachedAndValid(search->file, tag->data_size);
    if (!tag->checked && !FLVD_IsReadBeforeCheck(*search, *tag))
        return FLVD_SearchFrameTag(search, position, tag);
    tag->start = FLVD_FioTell(search->file);
    tag->budget = FLVD_RESYNC_WINDOW;
    // A host whose positions run backward could otherwise make a caller repeat the same tag forever.
    return tag->start >= position ? 0 : FLVD_ERR_NOT_FOUND;
}
