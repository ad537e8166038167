// The cached file inside the library: functions shared by the files of this folder, inline versions of the exported
// functions for the layers above, and a guard that changes the read size temporarily.
//
// Files: file.cpp (opening, positions, refill, peek, skip), block.cpp (reading and writing blocks), tables.cpp (the
// process-wide host functions).
#ifndef FLVDMX_FIO_FIO_H
#define FLVDMX_FIO_FIO_H

#include "flvdmx/fio/tables.h"
#include "flvdmx/flvdmx.h"

#include <algorithm>
#include <cstring>

constexpr int64_t FIO_POSITION_MAX = int64_t{1} << 62; // a host tell above this has failed
constexpr uint32_t FLVD_WHOLE_CACHE = 0;               // read size that stands for the capacity of the cache

// Reads up to n bytes from the host. A host that claims to have read more than n is broken: its result counts as 0.
inline uint32_t FLVD_FioHostRead(fio_file_t* file, uint8_t* destination, uint32_t n)
{
    const uint32_t got = g_flvd_fioFuncs.file_read(destination, 1, n, file->handle);
    return got <= n ? got : 0;
}

// Moves the cached bytes to the front of the cache.
inline void FLVD_FioCompact(fio_file_t* file)
{
    if (file->head == 0)
        return;
    std::memmove(file->cache, file->cache + file->head, file->count);
    file->head = 0;
}

// Reads and consumes up to n bytes, first from the cache, then from the host. Returns the number of bytes read.
uint32_t FLVD_FioReadBytes(fio_file_t* file, uint8_t* destination, uint32_t n);

// Invalidates the bit reader. Every access except a peek must call this, since it may move the position.
inline void FLVD_FioDropBits(fio_file_t* file)
{
    file->bits_left = 0;
    file->bits = 0;
}

// The cached bytes at the position; while reading there are file->count of them.
[[gnu::always_inline]] inline const uint8_t* FLVD_FioCached(const fio_file_t* file)
{
    return file->cache + file->head;
}

// Consumes n cached bytes; n is at most file->count.
[[gnu::always_inline]] inline void FLVD_FioConsume(fio_file_t* file, uint32_t n)
{
    file->count -= n;
    file->head = file->count == 0 ? 0 : file->head + n;
}

// Makes up to n bytes available at cache + head with at most one host read; the logical position does not move.
// Returns the number of bytes available, at most n; 0 while writing.
uint32_t FLVD_FioRefill(fio_file_t* file, uint32_t n);

// __FLV_DMX__fioShowBytesByPtr without a call when the bytes are cached: most of the work per frame is peeks and skips.
// Unlike there, *bytes is set even while writing, when the result is 0; do not use it then.
[[gnu::always_inline]] inline uint32_t FLVD_FioPeek(const uint8_t** bytes, uint32_t n, fio_file_t* file)
{
    if (n > file->count || file->state != FIO_STATE_READ)
        n = FLVD_FioRefill(file, n);
    *bytes = FLVD_FioCached(file);
    return n;
}

// Likewise for __FLV_DMX__fioSkipBytes. The bit reader skips through the exported function only.
inline uint32_t FLVD_FioSkip(uint32_t n, fio_file_t* file)
{
    if (n > file->count || file->state != FIO_STATE_READ)
        return __FLV_DMX__fioSkipBytes(n, file);
    FLVD_FioDropBits(file);
    FLVD_FioConsume(file, n);
    return n;
}

// Likewise for __FLV_DMX__fioIsEof.
inline bool FLVD_FioAtEnd(fio_file_t* file)
{
    return file->count == 0 && __FLV_DMX__fioIsEof(file) != 0;
}

// Converts the host's position to the logical one. A position that no file can have counts as a failed tell (-1), so
// that positions plus sizes never overflow; a negative result of the host stays negative.
inline int64_t FLVD_FioLogical(const fio_file_t* file, int64_t host)
{
    const bool reading = file->state == FIO_STATE_READ;
    if (static_cast<uint64_t>(host) <= uint64_t{FIO_POSITION_MAX})
        return reading ? host - file->count : host + file->count;
    if (host >= 0)
        return -1;
    return reading ? std::max(host, INT64_MIN + file->count) - file->count : host;
}

// Inline __FLV_DMX__fioTell64, for frame delivery, which needs the position twice per frame.
inline int64_t FLVD_FioTell(const fio_file_t* file)
{
    const int64_t host = g_flvd_fioFuncs.file_tell64 != nullptr ? g_flvd_fioFuncs.file_tell64(file->handle)
                                                                : g_flvd_fioFuncs.file_tell(file->handle);
    return FLVD_FioLogical(file, host);
}

// __FLV_DMX__fioSetCacheReadSize, for the guard below.
inline bool FLVD_FioSetReadSize(fio_file_t* file, uint32_t size)
{
    if (size > file->capacity)
        return false;
    file->read_size = size == FLVD_WHOLE_CACHE ? file->capacity : size;
    return true;
}

inline void FLVD_FioEmpty(fio_file_t* file)
{
    file->head = 0;
    file->count = 0;
}

// Changes the read size for one scope. `after` is part of the caller's contract: the forward search restores the size
// it found, while the searches that step through the file leave the whole cache.
class FLVD_ReadSizeGuard {
public:
    FLVD_ReadSizeGuard(fio_file_t* file, uint32_t during, uint32_t after) : m_file(file), m_after(after)
    {
        FLVD_FioSetReadSize(m_file, during);
    }
    ~FLVD_ReadSizeGuard() { FLVD_FioSetReadSize(m_file, m_after); }
    FLVD_ReadSizeGuard(const FLVD_ReadSizeGuard&) = delete;
    FLVD_ReadSizeGuard& operator=(const FLVD_ReadSizeGuard&) = delete;

private:
    fio_file_t* const m_file;
    const uint32_t m_after;
};

#endif
