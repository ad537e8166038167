// The cached file: opening, closing, positions, refilling, peeking and consuming.
//
// While reading, the host's position is `count` bytes ahead of the logical one (read-ahead); while writing it is
// `count` bytes behind (pending bytes). head + count never exceeds the size allocated for the cache.

#include "flvdmx/fio/fio.h"
#include "flvdmx/fio/tables.h"

#include <algorithm>
#include <iterator>

namespace {

// The bits of a mode that say how the file is accessed, and those that distinguish text from binary.
constexpr uint32_t FIO_ACCESS_MASK = 0x71;
constexpr uint32_t FIO_FORMAT_MASK = 0x300;
constexpr uint32_t FIO_SKIP_FAILED = 0xFFFFFFFF;
constexpr size_t FIO_MODE_TEXT_MAX = 4; // "r+b" and its NUL

struct fio_access_t {
    uint32_t flags;
    char text[3];
};

// By the access bits of a mode; text or binary is added afterwards. "w" truncates by definition, so FIO_MODE_TRUNCATE
// makes a difference only together with both reading and writing.
constexpr fio_access_t g_flvd_fioAccess[] = {
    {FIO_MODE_READ, "r"},
    {FIO_MODE_WRITE, "w"},
    {FIO_MODE_WRITE | FIO_MODE_TRUNCATE, "w"},
    {FIO_MODE_READ | FIO_MODE_WRITE, "r+"},
    {FIO_MODE_READ | FIO_MODE_WRITE | FIO_MODE_TRUNCATE, "w+"},
    {FIO_MODE_APPEND, "a"},
    {FIO_MODE_READ | FIO_MODE_APPEND, "a+"},
};

// Builds the mode string for the host, as fopen takes it. False for a combination that fopen has no string for.
bool FLVD_FioModeText(uint32_t mode, char (&text)[FIO_MODE_TEXT_MAX])
{
    const auto* const access = std::find_if(std::begin(g_flvd_fioAccess), std::end(g_flvd_fioAccess),
                                            [mode](const auto& a) { return a.flags == (mode & FIO_ACCESS_MASK); });
    const uint32_t format = mode & FIO_FORMAT_MASK;
    if (access == std::end(g_flvd_fioAccess) || format == FIO_FORMAT_MASK)
        return false;
    char* end = text;
    for (const char* c = access->text; *c != '\0'; ++c)
        *end++ = *c;
    if (format != 0)
        *end++ = format == FIO_MODE_TEXT ? 't' : 'b';
    *end = '\0';
    return true;
}

// Allocates the file object and its cache for an open handle. Without memory, closes the handle and returns null.
fio_file_t* FLVD_FioAllocate(uint32_t cache_size, uint32_t extra, void* handle)
{
    auto* const file = static_cast<fio_file_t*>(g_flvd_fioFuncs.mem_alloc(sizeof(fio_file_t)));
    // Both sizes come from the caller; a sum that wraps around would allocate less than the file object claims.
    const bool fits = extra <= UINT32_MAX - cache_size;
    auto* const cache =
        file != nullptr && fits ? static_cast<uint8_t*>(g_flvd_fioFuncs.mem_alloc(cache_size + extra)) : nullptr;
    if (cache != nullptr) {
        *file = fio_file_t{};
        file->handle = handle;
        file->cache = cache;
        return file;
    }
    g_flvd_fioFuncs.file_close(handle);
    if (file != nullptr)
        g_flvd_fioFuncs.mem_free(file);
    return nullptr;
}

enum class FioWidth { Bits32, Bits64 };

// Moves the host. Without file_seek64, a 64-bit seek becomes a 32-bit one: files below 2 GiB still work.
int32_t FLVD_FioHostSeek(const fio_file_t* file, int64_t offset, int32_t whence, FioWidth width)
{
    if (width == FioWidth::Bits64 && g_flvd_fioFuncs.file_seek64 != nullptr)
        return g_flvd_fioFuncs.file_seek64(file->handle, offset, whence);
    const auto low = static_cast<uint32_t>(static_cast<uint64_t>(offset)); // the 32-bit function takes no more
    return g_flvd_fioFuncs.file_seek(file->handle, static_cast<int32_t>(low), whence);
}

// Moves the logical position. A short relative step stays inside the read-ahead and costs no host call. Every other
// seek drops the read-ahead: finding out whether its target is cached would take a tell.
int32_t FLVD_FioSeekTo(fio_file_t* file, int64_t offset, int32_t whence, FioWidth width)
{
    if (file->state == FIO_STATE_WRITE)
        __FLV_DMX__fioFlush(file);
    FLVD_FioDropBits(file);
    if (whence != FIO_SEEK_SET && whence != FIO_SEEK_CUR && whence != FIO_SEEK_END)
        return -1;
    if (whence == FIO_SEEK_CUR) {
        if (offset >= 0 && static_cast<uint64_t>(offset) < file->count) {
            FLVD_FioConsume(file, static_cast<uint32_t>(offset)); // below count, so it fits
            return 0;
        }
        offset = static_cast<int64_t>(static_cast<uint64_t>(offset) - file->count); // the host is count bytes ahead
    }
    FLVD_FioEmpty(file);
    return FLVD_FioHostSeek(file, offset, whence, width);
}

} // namespace

fio_file_t* __FLV_DMX__fioOpen(const char* path, uint32_t mode, uint32_t cache_size, int32_t overread,
                               uint32_t overread_extra)
{
    char text[FIO_MODE_TEXT_MAX];
    if (!FLVD_FioModeText(mode, text))
        return nullptr;
    void* const handle = g_flvd_fioFuncs.file_open(path, text);
    if (handle == nullptr)
        return nullptr;
    const uint32_t extra = overread != 0 ? overread_extra : 0;
    fio_file_t* const file = FLVD_FioAllocate(cache_size, extra, handle);
    if (file == nullptr)
        return nullptr;
    file->state = FIO_STATE_IDLE;
    file->read_size = cache_size;
    file->capacity = cache_size;
    file->overread = overread;
    file->overread_extra = extra;
    return file;
}

int32_t __FLV_DMX__fioClose(fio_file_t* file)
{
    if (file == nullptr)
        return 0;
    if (file->state == FIO_STATE_WRITE)
        __FLV_DMX__fioFlush(file);
    void* const handle = file->handle;
    if (file->cache != nullptr)
        g_flvd_fioFuncs.mem_free(file->cache);
    g_flvd_fioFuncs.mem_free(file);
    return g_flvd_fioFuncs.file_close(handle);
}

int32_t __FLV_DMX__fioFlush(fio_file_t* file)
{
    FLVD_FioDropBits(file);
    if (file->count != 0 && file->state == FIO_STATE_WRITE)
        g_flvd_fioFuncs.file_write(file->cache + file->head, 1, file->count, file->handle);
    FLVD_FioEmpty(file);
    file->state = FIO_STATE_IDLE;
    return g_flvd_fioFuncs.file_flush(file->handle);
}

int32_t __FLV_DMX__fioTell(fio_file_t* file)
{
    const int64_t position = FLVD_FioLogical(file, g_flvd_fioFuncs.file_tell(file->handle));
    return static_cast<int32_t>(std::max<int64_t>(position, INT32_MIN)); // pending bytes past 2 GiB make it negative
}

int64_t __FLV_DMX__fioTell64(fio_file_t* file)
{
    return FLVD_FioTell(file);
}

// The host reports its own end, which the library reaches only after the cached bytes.
int32_t __FLV_DMX__fioIsEof(fio_file_t* file)
{
    return file->count != 0 ? 0 : g_flvd_fioFuncs.file_eof(file->handle);
}

uint32_t FLVD_FioRefill(fio_file_t* file, uint32_t n)
{
    if (file->state == FIO_STATE_WRITE)
        return 0;
    file->state = FIO_STATE_READ;
    // While reading with overread, the cache may hold more than its nominal capacity.
    const uint32_t allocated = file->capacity + file->overread_extra; // no overflow: checked at open
    n = std::min(n, allocated);
    if (n <= file->count)
        return n;
    FLVD_FioCompact(file);
    const uint32_t want = std::max(n, file->read_size);
    // Cached bytes count towards the read size; with overread, the full size is requested in addition to them.
    const uint32_t kept = file->overread != 0 ? 0 : file->count;
    file->count += FLVD_FioHostRead(file, file->cache + file->count, std::min(want - kept, allocated - file->count));
    return std::min(file->count, n);
}

uint32_t __FLV_DMX__fioShowBytesByPtr(const uint8_t** bytes, uint32_t n, fio_file_t* file)
{
    return file->state != FIO_STATE_WRITE ? FLVD_FioPeek(bytes, n, file) : 0;
}

uint32_t __FLV_DMX__fioSkipBytes(uint32_t n, fio_file_t* file)
{
    if (file->state == FIO_STATE_WRITE)
        return FIO_SKIP_FAILED;
    if (file->bit_skip_pending != 0)
        file->bit_skip_pending = 0; // the bit reader itself moves: its bits stay valid
    else
        FLVD_FioDropBits(file);
    if (n <= file->count) {
        FLVD_FioConsume(file, n);
        return n;
    }
    const uint32_t cached = file->count;
    const uint32_t rest = n - cached;
    FLVD_FioEmpty(file);
    if (rest > INT32_MAX && g_flvd_fioFuncs.file_seek64 == nullptr)
        return cached; // the 32-bit seek would take it as a negative offset
    return FLVD_FioHostSeek(file, rest, FIO_SEEK_CUR, FioWidth::Bits64) == 0 ? n : cached;
}

int32_t __FLV_DMX__fioSeek(fio_file_t* file, int32_t offset, int32_t whence)
{
    return FLVD_FioSeekTo(file, offset, whence, FioWidth::Bits32);
}

int32_t __FLV_DMX__fioSeek64(fio_file_t* file, int64_t offset, int32_t whence)
{
    return FLVD_FioSeekTo(file, offset, whence, FioWidth::Bits64);
}

// Kept because they are part of the binary interface.
uint64_t __FLV_DMX__fiodbgReadBytes(void)
{
    return 0;
}

void __FLV_DMX__fiodbgReset(void) {}
