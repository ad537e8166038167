// Describing the tag at the position: what playing does for every frame.

#include "flvdmx/tag/tag.h"

namespace {

// True when the tag at the position is cached far enough to be judged, plausible and wanted. Not for script data, whose
// back-pointer need not agree.
bool FLVD_IsNextWanted(const flvd_ctx_t* ctx, const fio_file_t* file, uint32_t wanted, flvd_tag_header_t* header)
{
    if (file->count < FLVD_TAG_PEEK_SIZE || file->state != FIO_STATE_READ || file->read_size != file->capacity)
        return false;
    *header = FLVD_ReadTagHeader(file->cache + file->head);
    return header->info.type != FLVD_TAG_TYPE_SCRIPT && FLVD_IsPlausibleTag(FLVD_TagRules(ctx), *header) &&
           FLVD_IsWantedTag(*header, wanted);
}

// True when the tag at the position is cached whole and its back-pointer agrees.
bool FLVD_IsCachedAndSound(const fio_file_t* file, uint32_t data_size)
{
    const uint32_t size = data_size + FLVD_TAG_OVERHEAD;
    return size <= file->count &&
           FLVD_IsBackPointer(file->cache + file->head + size - FLVD_BACK_POINTER_SIZE, data_size);
}

} // namespace

bool FLVD_CheckBehind(fio_file_t* file, uint32_t data_size)
{
    __FLV_DMX__fioSkipBytes(data_size + FLVD_TAG_HEADER_SIZE, file);
    const uint32_t quantum = file->read_size;
    const FLVD_ReadSizeGuard narrow(file, quantum > FLVD_NARROW_READ ? FLVD_BACK_POINTER_SIZE : quantum, quantum);
    const uint8_t* bytes = nullptr;
    return FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) == FLVD_BACK_POINTER_SIZE &&
           FLVD_IsBackPointer(bytes, data_size);
}

bool FLVD_GoBackToTag(fio_file_t* file, int64_t position)
{
    if (__FLV_DMX__fioSeek64(file, position, FIO_SEEK_SET) == 0)
        return true;
    return __FLV_DMX__fioSeek64(file, position, FIO_SEEK_SET) == 0;
}

int32_t FLVD_GetPlayedTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted)
{
    const int64_t position = FLVD_StartOnTag(ctx, file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    flvd_tag_header_t header;
    if (!FLVD_IsNextWanted(ctx, file, wanted, &header))
        return FLVD_SearchFrom(ctx, file, info, wanted, true, position);
    const bool large = header.info.data_size + FLVD_TAG_OVERHEAD > file->capacity;
    if (!large && !FLVD_IsCachedAndSound(file, header.info.data_size))
        return FLVD_SearchFrom(ctx, file, info, wanted, true, position);
    const int64_t start = FLVD_FioTell(file);
    if (start < position)
        return FLVD_ERR_NOT_FOUND;
    if (large) {
        if (!FLVD_CheckBehind(file, header.info.data_size))
            return FLVD_SearchPastBadTag(ctx, file, info, wanted, start);
        if (!FLVD_GoBackToTag(file, start))
            return FLVD_ERR_NOT_FOUND;
    }
    *info = header.info;
    return 0;
}
