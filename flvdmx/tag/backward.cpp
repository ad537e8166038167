// Backward navigation: the four bytes before a tag give the size of the previous tag. Where they do not lead to a
// consistent tag, the cursor slides back byte by byte until four bytes do. Going back needs no separate check of
// back-pointers, since every step follows one and compares it with the header that it leads to.
//
// Results of seeks are ignored here: after a failed one, the next peek or header check fails.

#include "flvdmx/tag/tag.h"

#include "flvdmx/common/bytes.h"
#include "flvdmx/fio/fio.h"

namespace {

// Reads the four bytes at the cursor, where the reader stands, as a back-pointer. 0 when they cannot be one.
int32_t FLVD_PeekBackPointer(fio_file_t* file, int64_t cursor)
{
    const uint8_t* bytes = nullptr;
    if (FLVD_FioPeek(&bytes, FLVD_BACK_POINTER_SIZE, file) < FLVD_BACK_POINTER_SIZE)
        return 0;
    // As a signed number, so that values from 2^31 on, which no tag has, are rejected together with 0.
    const auto value = static_cast<int32_t>(FLVD_GetBE32(bytes));
    return value > 0 && value < cursor ? value : 0;
}

// The back-pointer that led to a candidate bounds its size, so this needs no check against the end of the valid data.
bool FLVD_IsPreviousTag(const flvd_tag_rules_t& rules, const flvd_tag_header_t& header, int32_t back_pointer)
{
    return header.info.data_size + FLVD_TAG_HEADER_SIZE == static_cast<uint32_t>(back_pointer) &&
           FLVD_IsStreamTag(rules, header);
}

// The kind that stepping backward reports: less than forward. This is part of the documented interface.
uint32_t FLVD_BackwardKind(const flvd_tag_header_t& header, uint32_t wanted)
{
    if (header.IsVideo()) {
        if ((wanted & FLVD_TAG_KEYFRAME) != 0)
            return FLVD_TAG_VIDEO | FLVD_TAG_KEYFRAME;
        const bool config = (wanted & FLVD_TAG_CONFIG) != 0 && header.IsAvc();
        return config ? FLVD_TAG_VIDEO | FLVD_TAG_CONFIG : FLVD_TAG_VIDEO;
    }
    if (header.IsAudio()) {
        const bool config = (wanted & FLVD_TAG_CONFIG) != 0 && header.IsAac();
        return config ? FLVD_TAG_AUDIO | FLVD_TAG_CONFIG : FLVD_TAG_AUDIO;
    }
    return FLVD_TAG_SCRIPT;
}

enum class FlvdStepBack { Found, Unwanted, Inconsistent, ShortData };

// Follows the back-pointer at the cursor. With Found and Unwanted, the reader then stands at the start of its tag.
FlvdStepBack FLVD_StepBack(fio_file_t* file, const flvd_tag_rules_t& rules, int64_t cursor, uint32_t wanted,
                           flvd_tag_header_t* header)
{
    const int32_t back_pointer = FLVD_PeekBackPointer(file, cursor);
    if (back_pointer == 0)
        return FlvdStepBack::Inconsistent;
    __FLV_DMX__fioSeek64(file, -int64_t{back_pointer}, FIO_SEEK_CUR);
    if (!FLVD_PeekTagHeader(file, header))
        return FlvdStepBack::ShortData;
    if (!FLVD_IsPreviousTag(rules, *header, back_pointer))
        return FlvdStepBack::Inconsistent;
    return FLVD_IsWantedTag(*header, wanted) ? FlvdStepBack::Found : FlvdStepBack::Unwanted;
}

// Finds the last wanted tag that ends at or before the back-pointer at `cursor`, where the reader stands.
int32_t FLVD_SearchBack(fio_file_t* file, const flvd_ctx_t* ctx, int64_t cursor, uint32_t wanted,
                        flvd_tag_header_t* header)
{
    const flvd_tag_rules_t rules = FLVD_TagRules(ctx);
    int32_t budget = FLVD_RESYNC_WINDOW;
    while (cursor > ctx->data_offset) {
        switch (FLVD_StepBack(file, rules, cursor, wanted, header)) {
        case FlvdStepBack::Found:
            return 0;
        case FlvdStepBack::ShortData:
            return FLVD_ERR_END_OF_DATA;
        case FlvdStepBack::Unwanted: {
            __FLV_DMX__fioSeek64(file, -int64_t{FLVD_BACK_POINTER_SIZE}, FIO_SEEK_CUR);
            const int64_t before = FLVD_FioTell(file);
            if (before < 0 || before >= cursor) // seeks that do not move would make this an endless loop
                return FLVD_ERR_NOT_FOUND;
            cursor = before;
            budget = FLVD_RESYNC_WINDOW;
            break;
        }
        case FlvdStepBack::Inconsistent:
            --cursor;
            __FLV_DMX__fioSeek64(file, cursor, FIO_SEEK_SET);
            if (--budget <= 0)
                return cursor > ctx->data_offset ? FLVD_ERR_NOT_FOUND : FLVD_ERR_AT_FIRST_TAG;
            break;
        }
    }
    return FLVD_ERR_AT_FIRST_TAG;
}

} // namespace

int32_t FLVD_MoveToPrevTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted, uint32_t* kind)
{
    if (kind != nullptr)
        *kind = 0;
    const int64_t position = FLVD_FioTell(file);
    if (position < 0)
        return FLVD_ERR_NOT_FOUND;
    if (position <= ctx->data_offset)
        return FLVD_ERR_AT_FIRST_TAG;
    __FLV_DMX__fioSeek64(file, -int64_t{FLVD_BACK_POINTER_SIZE}, FIO_SEEK_CUR);
    flvd_tag_header_t header;
    const int32_t result = FLVD_SearchBack(file, ctx, position - FLVD_BACK_POINTER_SIZE, wanted, &header);
    if (result != 0)
        return result;
    *info = header.info;
    if (kind != nullptr)
        *kind = FLVD_BackwardKind(header, wanted);
    return 0;
}
