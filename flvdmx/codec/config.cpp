// The instance's copy of a codec configuration. It outlives the cache from which it comes, and belongs to the instance
// until the close, so that hosts may keep the pointer from the open.

#include "flvdmx/codec/codec.h"

#include "flvdmx/fio/tables.h"

bool FLVD_ReplaceConfig(uint8_t** config, uint32_t* config_size, const uint8_t* source, uint32_t size, uint32_t header)
{
    if (*config != nullptr)
        g_flvd_memFuncs.mem_free(*config);
    *config = nullptr;
    *config_size = 0;
    if (size < header)
        return false;
    auto* const copy = static_cast<uint8_t*>(g_flvd_memFuncs.mem_alloc(size - header));
    if (copy == nullptr)
        return false;
    // Hosts need not support copies of 0 bytes.
    if (size > header)
        g_flvd_memFuncs.mem_copy(copy, source + header, size - header);
    *config = copy;
    *config_size = size - header;
    return true;
}
