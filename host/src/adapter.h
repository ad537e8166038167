// Turns a class of files into the functions of an flvd_init_t. A host of one's own is such a class: a type `Handle`,
// and static functions
//
//     Handle* Open(const char* path, const char* mode)              null: cannot be opened
//     int Close(Handle*)                                            0: done
//     size_t Read(Handle*, void* buffer, size_t wanted)             fewer than wanted: the end was reached
//     size_t Write(Handle*, const void* buffer, size_t count)       fewer than count: failed
//     int Seek(Handle*, int64_t offset, int whence)                 0: done; the end flag is cleared; whence is known
//     int64_t Tell(Handle*)                                         negative: failed
//     bool AtEnd(const Handle*)                                     a read has met the end and no seek followed
//     int Flush(Handle*)                                            0: done
#ifndef FLVDMX_HOST_ADAPTER_H
#define FLVDMX_HOST_ADAPTER_H

#include "flvdmx/flvdmx.h"

#include <cstddef>
#include <cstdlib>
#include <cstring>

namespace flvd_host {

/** Remembers why an open failed, a value of errno, for this thread; 0: it did not. */
void SetOpenError(int error);
/** @return what was remembered last */
int OpenError();

/** @return true when the mode only reads */
inline bool IsReadMode(const char* mode)
{
    return mode[0] == 'r' && std::strchr(mode, '+') == nullptr;
}

/** @return base + offset, or -1 when no position can be there */
inline int64_t Target(int64_t base, int64_t offset)
{
    return offset <= INT64_MAX - base && base + offset >= 0 ? base + offset : -1; // base is no negative number
}

/**
 * Where a file stands, counted from what the system said last: the library asks twice a frame, and the system takes
 * longer to answer than the library for the frame. Zeroed, it is not known.
 */
struct CountedPosition {
    bool known;
    int64_t at;

    void Learn(int64_t told) { *this = {told >= 0, told}; }
    void Forget() { known = false; }
    void Pass(size_t bytes) { at += static_cast<int64_t>(bytes); }
};

/** Zeroed memory for a handle of a trivial type, or null. */
template <typename Handle> Handle* NewHandle()
{
    return static_cast<Handle*>(std::calloc(1, sizeof(Handle)));
}

inline void* Allocate(uint32_t size)
{
    return std::malloc(size);
}

inline void Release(void* memory)
{
    std::free(memory);
}

inline void* Copy(void* destination, const void* source, uint32_t count)
{
    return std::memcpy(destination, source, count);
}

inline void* Fill(void* destination, int value, uint32_t count)
{
    return std::memset(destination, value, count);
}

template <typename Files> struct Adapter {
    using Handle = typename Files::Handle;

    static Handle* As(void* handle) { return static_cast<Handle*>(handle); }

    static void* Open(const char* path, const char* mode) { return Files::Open(path, mode); }
    static int32_t Close(void* handle) { return Files::Close(As(handle)); }
    static int32_t IsEof(void* handle) { return Files::AtEnd(As(handle)) ? 1 : 0; }
    static int32_t Flush(void* handle) { return Files::Flush(As(handle)); }

    // The library's elements are single bytes; the quotients are at most `count`.
    static uint32_t Read(void* buffer, uint32_t size, uint32_t count, void* handle)
    {
        return size == 0 ? 0 : static_cast<uint32_t>(Files::Read(As(handle), buffer, size_t{size} * count) / size);
    }
    static uint32_t Write(const void* buffer, uint32_t size, uint32_t count, void* handle)
    {
        return size == 0 ? 0 : static_cast<uint32_t>(Files::Write(As(handle), buffer, size_t{size} * count) / size);
    }

    // Systems have origins of their own behind the three.
    static int32_t Seek64(void* handle, int64_t offset, int32_t whence)
    {
        const bool known = whence == FIO_SEEK_SET || whence == FIO_SEEK_CUR || whence == FIO_SEEK_END;
        return known ? Files::Seek(As(handle), offset, whence) : -1;
    }
    static int64_t Tell64(void* handle) { return Files::Tell(As(handle)); }

    // For callers that know no wider ones. A position that does not fit is a failure, never a smaller position.
    static int32_t Seek(void* handle, int32_t offset, int32_t whence) { return Seek64(handle, offset, whence); }
    static int32_t Tell(void* handle)
    {
        const int64_t position = Tell64(handle);
        return position > INT32_MAX ? -1 : static_cast<int32_t>(position);
    }
};

/** Clears the block and puts the C library's memory functions and those of `Files` into it. */
template <typename Files> void FillTables(flvd_init_t* init)
{
    using Functions = Adapter<Files>;
    *init = {};
    init->mem_alloc = Allocate;
    init->mem_free = Release;
    init->mem_copy = Copy;
    init->mem_set = Fill;
    init->file_open = Functions::Open;
    init->file_read = Functions::Read;
    init->file_seek = Functions::Seek;
    init->file_tell = Functions::Tell;
    init->file_close = Functions::Close;
    init->file_eof = Functions::IsEof;
    init->file_flush = Functions::Flush;
    init->file_write = Functions::Write;
    init->file_seek64 = Functions::Seek64;
    init->file_tell64 = Functions::Tell64;
}

} // namespace flvd_host

#endif
