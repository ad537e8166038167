// Opening, up to and including the file header, and releasing an instance.
//
// A failed open leaves nothing behind. Every resource has its field in the instance, which starts as zeros, so one
// release function serves a complete instance and one that was only partly opened.

#include "flvdmx/front/front.h"

#include "flvdmx/common/instance.h"
#include "flvdmx/fio/fio.h"
#include "flvdmx/fio/tables.h"
#include "flvdmx/tag/tag.h"

#include <algorithm>

namespace {

constexpr uint32_t FLVD_CACHE_DEFAULT = 4096;
constexpr uint32_t FLVD_CACHE_MIN = 1024;
constexpr uint32_t FLVD_SCAN_READ_DEFAULT = FLVD_NARROW_READ;
// In bytes. Holds the frames of most files without growing; a larger frame makes it grow once.
constexpr uint32_t FLVD_FRAME_BUFFER_SIZE = 512000;

// FLV file header (annex E.2): Signature, Version, TypeFlags, DataOffset. Version is not checked: files of later
// versions, if there were any, would have a larger DataOffset.
constexpr uint32_t FLVD_SIGNATURE = 0x464C56; // "FLV"
constexpr uint32_t FLVD_SIGNATURE_BITS = 24;
constexpr uint32_t FLVD_SIGNATURE_STEPS = 1048576; // bytes searched for the signature: 1 MiB
constexpr uint32_t FLVD_HEADER_SIZE = 9;
constexpr int32_t FLVD_DATA_OFFSET_MIN = 9;
constexpr uint32_t FLVD_HEADER_VIDEO = 0x01;
constexpr uint32_t FLVD_HEADER_AUDIO = 0x04;

// The two function tables have orders of their own, which are part of the binary interface.
void FLVD_SetMemFuncs(const flvd_init_t* init)
{
    g_flvd_memFuncs = {init->mem_free,  init->mem_alloc, init->mem_copy,
                       init->mem_slot1, init->mem_slot3, init->mem_set};
}

void FLVD_SetFileFuncs(const flvd_init_t* init)
{
    const fio_funcs_t funcs = {
        init->mem_alloc, init->mem_slot1, init->mem_free,   init->mem_slot3,   init->mem_copy,    init->mem_slot5,
        init->mem_set,   init->file_open, init->file_close, init->file_read,   init->file_write,  init->file_seek,
        init->file_tell, init->file_eof,  init->file_flush, init->file_seek64, init->file_tell64,
    };
    __FLV_DMX__fioSetFunc(&funcs);
}

// Applies the settings of the block and their defaults. A cache below the minimum would not hold the headers that
// probing looks at.
void FLVD_Configure(flvd_ctx_t* ctx, const flvd_init_t* init, bool for_info)
{
    ctx->video_codec_filter = FLVD_ANY_CODEC;
    ctx->audio_format_filter = FLVD_ANY_CODEC;
    ctx->options = static_cast<uint32_t>(init->options); // only the low 32 bits of a word count
    ctx->opened_for_info = for_info ? 1 : 0;
    const auto cache_size = static_cast<uint32_t>(init->cache_size);
    ctx->cache_size = cache_size == 0 ? FLVD_CACHE_DEFAULT : std::max(cache_size, FLVD_CACHE_MIN);
    const auto scan_read_size = static_cast<uint32_t>(init->scan_read_size);
    ctx->scan_read_size = std::min(scan_read_size == 0 ? FLVD_SCAN_READ_DEFAULT : scan_read_size, ctx->cache_size);
    ctx->file_info.file_name = init->file_name;
}

fio_file_t* FLVD_OpenReader(const flvd_ctx_t* ctx, const char* file_name)
{
    return __FLV_DMX__fioOpen(file_name, FIO_MODE_READ | FIO_MODE_BINARY, ctx->cache_size, 0, 0);
}

// Opens the readers and allocates the frame buffer. Returns the site of a failure, or FLVD_SITE_NONE.
flvd_site_t FLVD_Acquire(flvd_ctx_t* ctx, const char* file_name)
{
    ctx->main_reader = FLVD_OpenReader(ctx, file_name);
    if (ctx->main_reader == nullptr)
        return FLVD_SITE_OPEN_MAIN_READER;
    ctx->audio_reader = FLVD_HasAudioReader(ctx) ? FLVD_OpenReader(ctx, file_name) : ctx->main_reader;
    if (ctx->audio_reader == nullptr)
        return FLVD_SITE_OPEN_AUDIO_READER;
    ctx->cur_reader = ctx->main_reader;
    if (FLVD_HasUserBuffer(ctx))
        return FLVD_SITE_NONE;
    ctx->frame_buffer = static_cast<uint8_t*>(g_flvd_memFuncs.mem_alloc(FLVD_FRAME_BUFFER_SIZE));
    if (ctx->frame_buffer == nullptr)
        return FLVD_SITE_OPEN_FRAME_BUFFER;
    ctx->frame_buffer_size = FLVD_FRAME_BUFFER_SIZE;
    return FLVD_SITE_NONE;
}

// Moves the bit reader to the first "FLV". After 1 MiB without it, parses the bytes there as a header anyway.
// False when fewer bytes are left than a header has.
bool FLVD_FindSignature(fio_file_t* file)
{
    __FLV_DMX__bitInit(file);
    uint32_t signature = __FLV_DMX__bitShowUBits(file, FLVD_SIGNATURE_BITS);
    for (uint32_t step = 0;; ++step) {
        const uint8_t* bytes = nullptr;
        if (FLVD_FioPeek(&bytes, FLVD_HEADER_SIZE, file) < FLVD_HEADER_SIZE)
            return false;
        if (signature == FLVD_SIGNATURE || step == FLVD_SIGNATURE_STEPS)
            return true;
        signature = (signature << 8 | bytes[FLVD_SIGNATURE_BITS / 8]) & 0xFFFFFF;
        __FLV_DMX__bitSkipBits(file, 8);
    }
}

// Sets the size of a complete file. Until the end of the valid data is known, the whole file counts as valid.
bool FLVD_MeasureFile(flvd_ctx_t* ctx)
{
    if (__FLV_DMX__fioSeek64(ctx->main_reader, 0, FIO_SEEK_END) != 0)
        return false;
    const int64_t size = FLVD_FioTell(ctx->main_reader);
    if (size < 0 || ctx->data_offset >= size)
        return false;
    ctx->file_size = size;
    ctx->data_end = size;
    return true;
}

} // namespace

bool FLVD_ReadFileHeader(flvd_ctx_t* ctx)
{
    fio_file_t* const file = ctx->main_reader;
    if (!FLVD_FindSignature(file))
        return false;
    __FLV_DMX__bitSkipBits(file, 32); // signature and version
    const uint32_t flags = __FLV_DMX__bitGetUBits(file, 8);
    if ((flags & FLVD_HEADER_VIDEO) != 0)
        ctx->streams |= FLVD_STREAM_VIDEO;
    if ((flags & FLVD_HEADER_AUDIO) != 0)
        ctx->streams |= FLVD_STREAM_AUDIO;
    // DataOffset, the size of the file header; 9 in version 1. Values from 2^31 on become negative and are rejected.
    ctx->data_offset = static_cast<int32_t>(__FLV_DMX__bitGetUBits(file, 32));
    if (ctx->data_offset < FLVD_DATA_OFFSET_MIN)
        return false;
    if (!FLVD_IsGrowing(ctx))
        return FLVD_MeasureFile(ctx);
    // A growing file has no end yet: no size, offset or position in it counts as too large.
    ctx->file_size = INT64_MAX;
    ctx->data_end = INT64_MAX;
    return true;
}

flvd_ctx_t* FLVD_OpenInstance(const flvd_init_t* init, flvd_open_info_t* info, bool for_info)
{
    FLVD_SetMemFuncs(init);
    auto* const ctx = static_cast<flvd_ctx_t*>(g_flvd_memFuncs.mem_alloc(sizeof(flvd_ctx_t)));
    if (ctx == nullptr) {
        FLVD_RecordGlobal(FLVD_SITE_OPEN_INSTANCE, false);
        return nullptr;
    }
    g_flvd_memFuncs.mem_set(ctx, 0, sizeof *ctx);
    g_flvd_memFuncs.mem_set(info, 0, sizeof *info);
    FLVD_Configure(ctx, init, for_info);
    FLVD_SetFileFuncs(init);
    FLVD_SetCallbackforMeta(init);
    // Any failure after this point releases what has been obtained so far, through the same function as a close.
    flvd_site_t site = FLVD_Acquire(ctx, init->file_name);
    if (site == FLVD_SITE_NONE)
        site = FLVD_ReadFileHeader(ctx) ? FLVD_ProbeStreams(ctx, info) : FLVD_SITE_OPEN_FILE_HEADER;
    if (site == FLVD_SITE_NONE)
        return ctx;
    FLVD_RecordGlobal(site, FLVD_IsGrowing(ctx));
    FLVD_ReleaseInstance(ctx);
    return nullptr;
}

void FLVD_ReleaseInstance(flvd_ctx_t* ctx)
{
    // A later open may have replaced the tables. Hosts must pass the same functions to every open, and this
    // relies on it.
    const auto release = g_flvd_memFuncs.mem_free;
    __FLV_DMX__fioClose(ctx->main_reader);
    if (FLVD_HasAudioReader(ctx))
        __FLV_DMX__fioClose(ctx->audio_reader);
    if (ctx->video_info.config != nullptr)
        release(ctx->video_info.config);
    if (ctx->audio_info.config != nullptr)
        release(ctx->audio_info.config);
    if (!FLVD_HasUserBuffer(ctx))
        release(ctx->frame_buffer);
    if (ctx->keyframe_arrays.times_ms != nullptr)
        release(ctx->keyframe_arrays.times_ms);
    if (ctx->keyframe_arrays.positions != nullptr)
        release(ctx->keyframe_arrays.positions);
    release(ctx);
}
