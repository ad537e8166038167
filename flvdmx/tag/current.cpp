// Describing the tag at the position: what playing does for every frame.

#include "flvdmx/tag/tag.h"

namespace {

// True when the tag at the position is sound, wanted and in the cache whole, so that nothing need be read or moved to
// take it: most tags of a file that is played.
bool FLVD_IsCachedAndSound(const flvd_ctx_t* ctx, const fio_file_t* file, uint32_t wanted, flvd_tag_header_t* header)
{
    if (file->count < FLVD_TAG_PEEK_SIZE || file->state != FIO_STATE_READ || file->read_size != file->capacity)
        return false;
    const uint8_t* const bytes = file->cache + file->head;
    *header = FLVD_ReadTagHeader(bytes);
    const uint32_t size = header->info.data_size + FLVD_TAG_OVERHEAD;
    return size <= file->count && FLVD_IsBackPointer(bytes + size - FLVD_BACK_POINTER_SIZE, header->info.data_size) &&
           FLVD_IsPlausibleTag(FLVD_TagRules(ctx), *header) && FLVD_IsWantedTag(*header, wanted);
}

} // namespace

int32_t FLVD_GetCurrTagInfo(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted, int32_t verify)
{
    const int64_t position = __FLV_DMX__fioTell64(file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    if (position == ctx->data_offset)
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    flvd_tag_header_t header;
    if (verify == 0 || !FLVD_IsCachedAndSound(ctx, file, wanted, &header))
        return FLVD_SearchFrom(ctx, file, info, wanted, verify != 0, position);
    if (__FLV_DMX__fioTell64(file) < position)
        return FLVD_ERR_NOT_FOUND;
    *info = header.info;
    return 0;
}
