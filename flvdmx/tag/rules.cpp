// Moving between tags: over a back-pointer, and to the first tag.

#include "flvdmx/tag/tag.h"

bool FLVD_PassBackPointer(fio_file_t* file, uint32_t data_size)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return false;
    if (FLVD_IsBackPointer(bytes, data_size))
        FLVD_FioSkip(FLVD_BACK_POINTER_SIZE, file);
    return true;
}

int32_t FLVD_SeekToFirstTag(const flvd_ctx_t* ctx, fio_file_t* file)
{
    return __FLV_DMX__fioSeek64(file, ctx->data_offset, FIO_SEEK_SET);
}
