/* A file on callbacks, for tests that link the host kit. */
#pragma once

#include "flvdmx/callback_host.h"

#include <algorithm>

namespace flvd_test {

/** Bytes that the callback host opens by name while the object exists, which must outlive all instances that use it. */
struct CallbackFile : flvd_callback_file_t {
    CallbackFile(const void* bytes, uint64_t length)
        : flvd_callback_file_t{ReadAt, GetSize, this, "", nullptr}, data(static_cast<const char*>(bytes)), size(length)
    {
        flvd_callback_host_add(this);
    }
    ~CallbackFile() { flvd_callback_host_remove(this); }

    const char* const data;
    uint64_t size; /**< may change: the file grows */

private:
    static int64_t GetSize(void* user) { return static_cast<int64_t>(static_cast<CallbackFile*>(user)->size); }
    // Reads at most 1000 bytes, as a socket might.
    static uint32_t ReadAt(void* user, int64_t position, void* buffer, uint32_t size)
    {
        const int64_t n = std::clamp<int64_t>(GetSize(user) - position, 0, std::min<int64_t>(size, 1000));
        std::copy_n(static_cast<CallbackFile*>(user)->data + (n != 0 ? position : 0), n, static_cast<char*>(buffer));
        return static_cast<uint32_t>(n);
    }
};

} // namespace flvd_test
