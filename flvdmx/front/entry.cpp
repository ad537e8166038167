// The entry point: dispatches operations and translates error codes into the four failure results that a host sees.

#include "flvdmx/front/front.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/seek/seek.h"

namespace {

// Error codes are grouped: from -1 on resources, from -1000 on files, -2000 seeks, -3000 codecs, -4000 requests, -10000
// data. The group of seeks is split: a frame seek that failed (-2000) is a failure for the host, a miss (-2003) is an
// end.
constexpr int32_t FLVD_ERR_RESOURCE_LAST = -2002; // resources, file header and probing
constexpr int32_t FLVD_ERR_PLACE_LAST = -2005;    // positions that do not exist in the file

// Translates a failure for the host; `result` is what the operation itself returned.
int32_t FLVD_TranslateError(int32_t result, int32_t error)
{
    if (error >= FLVD_ERR_RESOURCE_LAST && error <= -1)
        return error == FLVD_ERR_OPEN_MAIN || error == FLVD_ERR_OPEN_AUDIO ? FLVD_RET_CANNOT_OPEN : result;
    const bool no_place = error >= FLVD_ERR_PLACE_LAST && error < FLVD_ERR_RESOURCE_LAST;
    if (no_place || error == FLVD_ERR_SHORT_DATA)
        return FLVD_RET_END;
    return error == FLVD_ERR_NO_INSTANCE ? FLVD_RET_NO_INSTANCE : result;
}

int32_t FLVD_CallOpen(flvd_ctx_t** handle, const void* init, void* info, bool for_info)
{
    if (handle == nullptr)
        return FLVD_RET_FAILED;
    *handle = nullptr;
    if (init == nullptr || info == nullptr)
        return FLVD_RET_FAILED;
    *handle = FLVD_OpenInstance(static_cast<const flvd_init_t*>(init), static_cast<flvd_open_info_t*>(info), for_info);
    return *handle != nullptr ? 0 : FLVD_TranslateError(-1, g_flvd_lLastError);
}

// Handles operations on a handle without an instance.
int32_t FLVD_OperateOnNothing(uint32_t operation)
{
    switch (operation) {
    case FLVD_OP_RESERVED:
        return FLVD_RET_FAILED;
    case FLVD_OP_GET_LAST_ERROR:
        return g_flvd_lLastError;
    default:
        FLVD_RecordGlobal(FLVD_SITE_NO_INSTANCE, false);
        return FLVD_RET_NO_INSTANCE;
    }
}

int32_t FLVD_CallGetFrame(flvd_ctx_t* ctx, const void* request, void* frame)
{
    if (request == nullptr || frame == nullptr)
        return FLVD_RET_FAILED;
    const int32_t result =
        FLVD_GetFrame(ctx, static_cast<const flvd_frame_request_t*>(request), static_cast<flvd_frame_t*>(frame));
    return result >= 0 ? result : FLVD_TranslateError(result, ctx->error);
}

int32_t FLVD_CallSeek(flvd_ctx_t* ctx, const void* arguments, void* reached)
{
    if (arguments == nullptr || reached == nullptr)
        return FLVD_RET_FAILED;
    const auto* const request = static_cast<const flvd_seek_request_t*>(arguments);
    const auto seek = FLVD_IsGrowing(ctx) ? FLVD_RunTimeSeekProgressive : FLVD_RunTimeSeek;
    const int32_t result = seek(ctx, request->time, static_cast<int32_t*>(reached), request->mode);
    return result >= 0 ? result : FLVD_TranslateError(result, ctx->error);
}

// Handles operations on an instance.
int32_t FLVD_Operate(uint32_t operation, flvd_ctx_t* ctx, const void* arg1, void* arg2)
{
    if (ctx == nullptr)
        return FLVD_OperateOnNothing(operation);
    switch (operation) {
    case FLVD_OP_GET_FRAME:
        return FLVD_CallGetFrame(ctx, arg1, arg2);
    case FLVD_OP_SEEK:
        return FLVD_CallSeek(ctx, arg1, arg2);
    case FLVD_OP_CLOSE:
        FLVD_ReleaseInstance(ctx);
        return 0;
    case FLVD_OP_GET_LAST_ERROR:
        return ctx->error;
    default:
        FLVD_Record(ctx, FLVD_SITE_RESERVED_OPERATION);
        return FLVD_RET_FAILED;
    }
}

} // namespace

int32_t QVX_FLV_DMX(uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2)
{
    if (operation >= FLVD_OP_CLOSE && operation <= FLVD_OP_GET_LAST_ERROR)
        return FLVD_Operate(operation, handle != nullptr ? *handle : nullptr, arg1, arg2);
    if (operation == FLVD_OP_OPEN || operation == FLVD_OP_OPEN_INFO)
        return FLVD_CallOpen(handle, arg1, arg2, operation == FLVD_OP_OPEN_INFO);
    return FLVD_RET_FAILED;
}
