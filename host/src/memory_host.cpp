// Host functions over the caller's memory.

#include "flvdmx/memory_host.h"

#include "host/src/adapter.h"

#include <algorithm>
#include <cstdio>

namespace {

flvd_memory_file_t* firstFile = nullptr;

struct MemoryFiles {
    struct Handle {
        const flvd_memory_file_t* file;
        int64_t position;
        bool end; // a read met the end and no seek followed
    };

    static Handle* Open(const char* path, const char* mode)
    {
        const flvd_memory_file_t* file = firstFile;
        while (file != nullptr && std::strcmp(file->name, path) != 0)
            file = file->next;
        auto* const handle = file != nullptr && flvd_host::IsReadMode(mode) ? flvd_host::NewHandle<Handle>() : nullptr;
        if (handle != nullptr)
            handle->file = file;
        return handle;
    }

    static int Close(Handle* handle)
    {
        std::free(handle);
        return 0;
    }

    static size_t Read(Handle* handle, void* buffer, size_t wanted)
    {
        const auto at = static_cast<uint64_t>(handle->position); // no seek makes it negative
        const uint64_t left = at < handle->file->size ? handle->file->size - at : 0;
        const auto n = static_cast<size_t>(std::min<uint64_t>(wanted, left));
        if (n != 0)
            std::memcpy(buffer, static_cast<const char*>(handle->file->data) + at, n);
        handle->position += static_cast<int64_t>(n);
        handle->end = handle->end || n < wanted;
        return n;
    }

    static int Seek(Handle* handle, int64_t offset, int whence)
    {
        int64_t base = whence == SEEK_CUR ? handle->position : 0;
        if (whence == SEEK_END)
            base = static_cast<int64_t>(handle->file->size); // memory is smaller than that
        const int64_t target = flvd_host::Target(base, offset);
        if (target < 0)
            return -1;
        handle->position = target;
        handle->end = false;
        return 0;
    }

    static size_t Write(Handle*, const void*, size_t) { return 0; }
    static int64_t Tell(Handle* handle) { return handle->position; }
    static bool AtEnd(const Handle* handle) { return handle->end; }
    static int Flush(Handle*) { return 0; }
};

} // namespace

void flvd_memory_host_add(flvd_memory_file_t* file)
{
    file->next = firstFile;
    firstFile = file;
}

void flvd_memory_host_remove(const flvd_memory_file_t* file)
{
    flvd_memory_file_t** link = &firstFile;
    while (*link != nullptr && *link != file)
        link = &(*link)->next;
    if (*link != nullptr)
        *link = file->next;
}

void flvd_memory_host_fill(flvd_init_t* init)
{
    flvd_host::FillTables<MemoryFiles>(init);
}
