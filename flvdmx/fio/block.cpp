// Block access to a cached file: peeking by copy, reading, writing, and the read size.
//
// Large reads go past the cache, straight into the caller's memory: copying a frame twice would cost more than the host
// call that this saves. Small ones fill the cache, because more reads usually follow.

#include "flvdmx/fio/fio.h"
#include "flvdmx/fio/tables.h"

#include <algorithm>

namespace {

// False for empty elements and for blocks whose size does not fit in 32 bits; those are neither read nor written.
bool FLVD_FioIsBlock(uint32_t size, uint32_t count)
{
    return size != 0 && uint64_t{size} * count <= UINT32_MAX;
}

// Copies n cached bytes to the destination and consumes them.
void FLVD_FioTake(fio_file_t* file, uint8_t* destination, uint32_t n)
{
    if (n != 0)
        g_flvd_fioFuncs.mem_copy(destination, file->cache + file->head, n);
    FLVD_FioConsume(file, n);
}

// Reads up to n bytes through the empty cache, with one host read of the read size. Returns the number still missing.
uint32_t FLVD_FioReadThroughCache(fio_file_t* file, uint8_t* destination, uint32_t n)
{
    file->count = FLVD_FioHostRead(file, file->cache, file->read_size);
    const uint32_t taken = std::min(n, file->count);
    FLVD_FioTake(file, destination, taken);
    return n - taken;
}

// With overread: reads pieces of the read size straight into the destination, and the rest through the cache, so that
// the cache again holds bytes beyond the request. Returns the number of bytes still missing.
uint32_t FLVD_FioReadOver(fio_file_t* file, uint8_t* destination, uint32_t n)
{
    while (n > file->read_size) {
        const uint32_t got = FLVD_FioHostRead(file, destination, file->read_size);
        destination += got;
        n -= got;
        if (got < file->read_size || got == 0) // 0: without a cache the read size is 0
            break;
    }
    return FLVD_FioReadThroughCache(file, destination, n);
}

// Appends n bytes to the pending ones; there is room for them.
void FLVD_FioPutPending(fio_file_t* file, const void* source, uint32_t n)
{
    FLVD_FioCompact(file);
    if (n != 0)
        g_flvd_fioFuncs.mem_copy(file->cache + file->count, source, n);
    file->count += n;
}

// As for reads, a host that claims more than it was given does not make counts wrap around.
uint32_t FLVD_FioHostWrite(fio_file_t* file, const void* source, uint32_t n)
{
    return std::min(g_flvd_fioFuncs.file_write(source, 1, n, file->handle), n);
}

} // namespace

uint32_t FLVD_FioReadBytes(fio_file_t* file, uint8_t* destination, uint32_t n)
{
    // A file may be read and written in turn; its pending bytes must reach the host before its position is used again.
    if (file->state == FIO_STATE_WRITE)
        __FLV_DMX__fioFlush(file);
    file->state = FIO_STATE_READ;
    FLVD_FioDropBits(file);
    // The common case. A request that uses up the cached bytes is handled below: if little is missing, the rest comes
    // through the cache, which is then refilled for the next request.
    if (n < file->count) {
        FLVD_FioTake(file, destination, n);
        return n;
    }
    const uint32_t cached = file->count;
    FLVD_FioTake(file, destination, cached);
    const uint32_t rest = n - cached;
    destination += cached;
    if (rest < file->read_size)
        return n - FLVD_FioReadThroughCache(file, destination, rest);
    if (file->overread != 0)
        return n - FLVD_FioReadOver(file, destination, rest);
    return cached + FLVD_FioHostRead(file, destination, rest);
}

uint32_t __FLV_DMX__fioShowBytesByCopy(void* destination, uint32_t n, fio_file_t* file)
{
    const uint8_t* bytes = nullptr;
    const uint32_t available = FLVD_FioPeek(&bytes, n, file);
    if (available != 0)
        g_flvd_fioFuncs.mem_copy(destination, bytes, available);
    return available;
}

uint32_t __FLV_DMX__fioRead(void* destination, uint32_t size, uint32_t count, fio_file_t* file)
{
    if (!FLVD_FioIsBlock(size, count))
        return 0;
    return FLVD_FioReadBytes(file, static_cast<uint8_t*>(destination), size * count) / size;
}

uint32_t __FLV_DMX__fioWrite(const void* source, uint32_t size, uint32_t count, fio_file_t* file)
{
    if (!FLVD_FioIsBlock(size, count))
        return 0;
    const uint32_t total = size * count;
    if (file->state == FIO_STATE_READ)
        __FLV_DMX__fioFlush(file);
    file->state = FIO_STATE_WRITE;
    FLVD_FioDropBits(file);
    // Small writes are collected. When the cache would become full, the pending bytes go to the host first, and a block
    // as large as the cache follows them directly.
    if (uint64_t{file->count} + total < file->capacity) {
        FLVD_FioPutPending(file, source, total);
        return count;
    }
    if (file->count != 0) {
        const uint32_t written = FLVD_FioHostWrite(file, file->cache + file->head, file->count);
        // After a partial write, the rest stays pending and the new block is refused: the bytes of a file must not
        // change their order.
        const bool all = written == file->count;
        FLVD_FioConsume(file, written);
        if (!all)
            return 0;
    }
    if (total < file->capacity) {
        FLVD_FioPutPending(file, source, total);
        return count;
    }
    return FLVD_FioHostWrite(file, source, total) / size;
}

int32_t __FLV_DMX__fioSetCacheReadSize(fio_file_t* file, uint32_t size)
{
    return FLVD_FioSetReadSize(file, size) ? 1 : 0;
}

uint32_t __FLV_DMX__fioGetCacheReadSize(fio_file_t* file)
{
    return file->read_size;
}
