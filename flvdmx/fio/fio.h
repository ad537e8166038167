// The cached file from inside the library: what its own files share, and the short ways that the layers above use where
// the exported functions would cost a call. The guard narrows the read size for a while.
//
// Files: file.cpp (opening, positions, refill, peek, skip), block.cpp (reading and writing blocks), tables.cpp (the
// process-wide host functions).
#ifndef FLVDMX_FIO_FIO_H
#define FLVDMX_FIO_FIO_H

#include "flvdmx/fio/tables.h"
#include "flvdmx/flvdmx.h"

#include <algorithm>
#include <cstring>

constexpr int64_t FIO_POSITION_MAX = int64_t{1} << 62; // a host that tells more has not told a position
constexpr uint32_t FLVD_WHOLE_CACHE = 0;               // as a read size: the capacity of the file's cache

// Reads up to n bytes from the host. One that claims more than it was asked for has failed: none of
// its bytes count.
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

// Reads and consumes up to n bytes: what is cached, then with host reads. Returns how many there were.
uint32_t FLVD_FioReadBytes(fio_file_t* file, uint8_t* destination, uint32_t n);

// What every access but a peek does: the bit reader's bits are no longer those at the position.
inline void FLVD_FioDropBits(fio_file_t* file)
{
    file->bits_left = 0;
    file->bits = 0;
}

// The cached bytes at the position, file->count of them while reading.
[[gnu::always_inline]] inline const uint8_t* FLVD_FioCached(const fio_file_t* file)
{
    return file->cache + file->head;
}

// Consumes n cached bytes, n being at most file->count.
[[gnu::always_inline]] inline void FLVD_FioConsume(fio_file_t* file, uint32_t n)
{
    file->count -= n;
    file->head = file->count == 0 ? 0 : file->head + n;
}

// Makes up to n bytes visible at cache + head with at most one host read; the logical position stays.
// Returns how many are, or 0 in the writing state.
uint32_t FLVD_FioRefill(fio_file_t* file, uint32_t n);

// __FLV_DMX__fioShowBytesByPtr, without a call when the bytes are cached: most of the work on a frame is peeks and
// skips. When it returns 0 because the file is being written, the pointer is not to be used.
[[gnu::always_inline]] inline uint32_t FLVD_FioPeek(const uint8_t** bytes, uint32_t n, fio_file_t* file)
{
    if (n > file->count || file->state != FIO_STATE_READ)
        n = FLVD_FioRefill(file, n);
    *bytes = FLVD_FioCached(file);
    return n;
}

// __FLV_DMX__fioSkipBytes in the same way. The bit reader's own skips do not come through here.
inline uint32_t FLVD_FioSkip(uint32_t n, fio_file_t* file)
{
    if (n > file->count || file->state != FIO_STATE_READ)
        return __FLV_DMX__fioSkipBytes(n, file);
    FLVD_FioDropBits(file);
    FLVD_FioConsume(file, n);
    return n;
}

// __FLV_DMX__fioIsEof in the same way.
inline bool FLVD_FioAtEnd(fio_file_t* file)
{
    return file->count == 0 && __FLV_DMX__fioIsEof(file) != 0;
}

// Logical position from the host's. A position that no file can have is a failed query (-1), so that adding sizes to
// positions never overflows; a negative one stays negative.
inline int64_t FLVD_FioLogical(const fio_file_t* file, int64_t host)
{
    const bool reading = file->state == FIO_STATE_READ;
    if (static_cast<uint64_t>(host) <= uint64_t{FIO_POSITION_MAX})
        return reading ? host - file->count : host + file->count;
    if (host >= 0)
        return -1;
    return reading ? std::max(host, INT64_MIN + file->count) - file->count : host;
}

// __FLV_DMX__fioTell64 for the playing path, which asks twice per frame.
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

// Read size for a while. `after` is part of each user's contract: the forward search puts back what it found,
// the users that step through the file leave 0, the whole cache.
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
