// Host functions over POSIX descriptors with a window over each file.
//
// The position that the library sees is a number here; the descriptor moves by reading, and only where a read goes on.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64 // pread and lseek take 64 bits on 32-bit systems too
#endif

#include "flvdmx/window_host.h"

#include "host/src/adapter.h"
#include "host/src/descriptor.h"

#include <algorithm>
#include <cerrno>

#include <sys/types.h>
#include <unistd.h>

namespace {

static_assert(sizeof(off_t) == sizeof(int64_t), "places beyond 2 GiB must be reached");

constexpr size_t WINDOW = FLVD_WINDOW_HOST_SIZE;
constexpr size_t BACK_POINTER = 4;
constexpr size_t BETWEEN_LARGE = WINDOW / 4; // read behind a large tag: what stands before the next one is short

struct WindowFile {
    int descriptor;
    bool end;              // a read met the end of the file and no seek followed
    int64_t position;      // what the library sees
    int64_t descriptor_at; // where the descriptor stands
    int64_t file_end;      // where it was when the library last asked for it
    bool large;            // the last read did not go through the window
    int64_t start;         // of the window in the file
    size_t count;          // bytes in it
    char window[WINDOW];
};

// Reads from a place of the file on, with one system call: where the descriptor stands elsewhere, it stays.
size_t ReadAt(WindowFile* file, int64_t from, void* buffer, size_t least, size_t most)
{
    if (from != file->descriptor_at)
        return flvd_host::ReadAtLeast(file->descriptor, from, buffer, least, most, &file->end);
    const size_t got = flvd_host::ReadAtLeast(file->descriptor, flvd_host::FROM_HERE, buffer, least, most, &file->end);
    file->descriptor_at += static_cast<int64_t>(got);
    return got;
}

// Copies what the window holds from the position on, and moves on behind it.
size_t TakeFromWindow(WindowFile* file, char* buffer, size_t wanted)
{
    const int64_t offset = file->position - file->start;
    if (offset < 0 || offset >= static_cast<int64_t>(file->count))
        return 0;
    const auto at = static_cast<size_t>(offset); // below WINDOW
    const size_t n = std::min(wanted, file->count - at);
    std::memcpy(buffer, file->window + at, n);
    file->position += static_cast<int64_t>(n);
    return n;
}

// True where the library steps backward: before the window, and from the end of the file.
bool IsWayBack(const WindowFile* file)
{
    const int64_t left = file->file_end - file->position;
    return file->position < file->start || (left > 0 && left < static_cast<int64_t>(WINDOW / 2));
}

// Puts the window where the position is, at its start, or in its middle on a way back. At least `wanted` bytes, fewer
// than half a window, are there behind the position unless the file ends; where nothing is, the window stays.
void MoveWindow(WindowFile* file, size_t wanted)
{
    const int64_t before = IsWayBack(file) ? std::min(file->position, static_cast<int64_t>(WINDOW / 2)) : 0;
    const int64_t start = file->position - before;
    const auto least = static_cast<size_t>(before) + wanted;
    const size_t got = ReadAt(file, start, file->window, least, file->large ? std::max(least, BETWEEN_LARGE) : WINDOW);
    file->large = false;
    if (got == 0)
        return;
    file->start = start;
    file->count = got;
}

struct WindowFiles {
    using Handle = WindowFile;

    static Handle* Open(const char* path, const char* mode)
    {
        if (!flvd_host::IsReadMode(mode)) {
            flvd_host::SetOpenError(EACCES);
            return nullptr;
        }
        return flvd_host::OpenHandle<Handle>(path, mode);
    }

    static int Close(Handle* file) { return flvd_host::CloseHandle(file); }

    // What does not fit half a window goes straight to the library. So does the back-pointer behind a tag that is
    // larger than the library's cache: it comes back to the tag, and finds the window there.
    static size_t Read(Handle* file, void* buffer, size_t wanted)
    {
        auto* const to = static_cast<char*>(buffer);
        const size_t done = TakeFromWindow(file, to, wanted);
        const size_t rest = wanted - done;
        if (rest == 0)
            return done;
        const bool behind = wanted <= BACK_POINTER && file->position > file->start + static_cast<int64_t>(file->count);
        if (rest < WINDOW / 2 && !behind) {
            MoveWindow(file, rest);
            return done + TakeFromWindow(file, to + done, rest);
        }
        const size_t got = ReadAt(file, file->position, to + done, rest, rest);
        file->position += static_cast<int64_t>(got);
        file->large = !behind;
        return done + got;
    }

    static int Seek(Handle* file, int64_t offset, int whence)
    {
        int64_t base = whence == SEEK_CUR ? file->position : 0;
        if (whence == SEEK_END) {
            base = lseek(file->descriptor, 0, SEEK_END);
            if (base < 0)
                return -1;
            file->descriptor_at = base;
            file->file_end = base;
        }
        const int64_t target = flvd_host::Target(base, offset);
        if (target < 0)
            return -1;
        file->position = target;
        file->end = false;
        return 0;
    }

    static size_t Write(Handle*, const void*, size_t) { return 0; }
    static int64_t Tell(Handle* file) { return file->position; }
    static bool AtEnd(const Handle* file) { return file->end; }
    static int Flush(Handle*) { return 0; }
};

} // namespace

void flvd_window_host_fill(flvd_init_t* init)
{
    flvd_host::FillTables<WindowFiles>(init);
}

int flvd_window_host_open_error(void)
{
    return flvd_host::OpenError();
}
