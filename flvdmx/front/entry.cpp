// The entry point: dispatch, and the translation of error codes into the few results that a host sees.

#include "flvdmx/front/front.h"

#include "flvdmx/seek/seek.h"

#include <cstddef>

int32_t g_flvd_lLastError;
int32_t g_flvd_lErrorLine;

namespace {

// The words of the two wide records are pointer-wide, so that word n lies at n pointer sizes on every machine.
constexpr size_t FLVD_WORD = sizeof(void*);
static_assert(sizeof(flvd_init_t) == 36 * FLVD_WORD);
static_assert(offsetof(flvd_init_t, file_open) == 16 * FLVD_WORD);
static_assert(offsetof(flvd_init_t, file_seek64) == 25 * FLVD_WORD);
static_assert(offsetof(flvd_init_t, file_name) == 32 * FLVD_WORD);
static_assert(offsetof(flvd_init_t, scan_read_size) == 35 * FLVD_WORD);
static_assert(sizeof(flvd_open_info_t) == 7 * FLVD_WORD);
static_assert(sizeof(flvd_mem_funcs_t) == 6 * FLVD_WORD && sizeof(fio_funcs_t) == 17 * FLVD_WORD);

// What a host sees of a failure; `result` is the operation's own.
int32_t FLVD_TranslateError(int32_t result, int32_t error)
{
    if (error >= -2002 && error <= -1)
        return error == FLVD_ERR_OPEN_MAIN || error == FLVD_ERR_OPEN_AUDIO ? FLVD_RET_CANNOT_OPEN : result;
    if (error >= -2005 && error <= -2003)
        return FLVD_RET_END;
    if (error == FLVD_ERR_SHORT_DATA)
        return FLVD_RET_END;
    return error == FLVD_ERR_NO_INSTANCE ? FLVD_RET_NO_INSTANCE : result;
}

int32_t FLVD_Open(flvd_ctx_t** handle, const void* init, void* info, bool for_info)
{
    if (handle == nullptr || init == nullptr || info == nullptr)
        return FLVD_RET_FAILED;
    *handle = FLVD_OpenInstance(static_cast<const flvd_init_t*>(init), static_cast<flvd_open_info_t*>(info), for_info);
    return *handle != nullptr ? 0 : FLVD_TranslateError(-1, g_flvd_lLastError);
}

int32_t FLVD_RefuseReserved(flvd_ctx_t* ctx)
{
    if (ctx != nullptr)
        FLVD_Record(ctx, FLVD_SITE_RESERVED_OP);
    return FLVD_RET_FAILED;
}

int32_t FLVD_RefuseMissing()
{
    FLVD_RecordGlobal(FLVD_SITE_NO_INSTANCE);
    return FLVD_RET_NO_INSTANCE;
}

int32_t FLVD_GetFrameOrSeek(uint32_t operation, flvd_ctx_t* ctx, const void* arg1, void* arg2)
{
    if (operation == FLVD_OP_GET_FRAME)
        return FLVD_GetFrame(ctx, static_cast<const flvd_frame_request_t*>(arg1), static_cast<flvd_frame_t*>(arg2));
    const auto* const request = static_cast<const flvd_seek_request_t*>(arg1);
    const bool growing = (ctx->options & FLVD_OPT_PROGRESSIVE) != 0;
    const auto seek = growing ? FLVD_RunTimeSeekProgressive : FLVD_RunTimeSeek;
    return seek(ctx, request->time, static_cast<int32_t*>(arg2), request->mode);
}

// Operations 1 to 3 on an instance.
int32_t FLVD_Run(uint32_t operation, flvd_ctx_t* ctx, const void* arg1, void* arg2)
{
    if (operation == FLVD_OP_CLOSE) {
        FLVD_ReleaseInstance(ctx);
        return 0;
    }
    if (arg1 == nullptr || arg2 == nullptr)
        return FLVD_RET_FAILED;
    const int32_t result = FLVD_GetFrameOrSeek(operation, ctx, arg1, arg2);
    return result >= 0 ? result : FLVD_TranslateError(result, ctx->error);
}

} // namespace

void FLVD_RecordGlobal(flvd_site_t site)
{
    g_flvd_lLastError = site.code;
    g_flvd_lErrorLine = site.line;
}

int32_t QVX_FLV_DMX(uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2)
{
    flvd_ctx_t* const ctx = handle != nullptr && operation <= FLVD_OP_GET_LAST_ERROR ? *handle : nullptr;
    switch (operation) {
    case FLVD_OP_OPEN:
    case FLVD_OP_OPEN_INFO:
        return FLVD_Open(handle, arg1, arg2, operation == FLVD_OP_OPEN_INFO);
    case FLVD_OP_CLOSE:
    case FLVD_OP_GET_FRAME:
    case FLVD_OP_SEEK:
        return ctx != nullptr ? FLVD_Run(operation, ctx, arg1, arg2) : FLVD_RefuseMissing();
    case FLVD_OP_RESERVED:
        return FLVD_RefuseReserved(ctx);
    case FLVD_OP_GET_LAST_ERROR:
        return ctx != nullptr ? ctx->error : g_flvd_lLastError;
    default:
        return FLVD_RET_FAILED;
    }
}
