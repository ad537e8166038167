// Recognises the names of known properties. Metadata may have thousands of other names, so the length decides first.
// Case is ignored, because muxers do not agree on it.

#include "flvdmx/meta/keys.h"

#include <iterator>

namespace {

struct flvd_meta_key_t {
    uint32_t length;
    const char* name;
};

// Sorted by length. No name has the length of the last entry, which ends every search.
constexpr flvd_meta_key_t g_flvd_metaKeyTable[] = {
    {5, "times"},
    {5, "width"},
    {6, "height"},
    {8, "duration"},
    {8, "filesize"},
    {9, "framerate"},
    {9, "keyframes"},
    {10, "audiodelay"},
    {13, "audiodatarate"},
    {13, "filepositions"},
    {13, "lasttimestamp"},
    {13, "totalduration"},
    {15, "audiosamplerate"},
    {15, "audiosamplesize"},
    {20, "lastkeyframelocation"},
    {21, "lastkeyframetimestamp"},
    {0, nullptr},
};
static_assert(std::size(g_flvd_metaKeyTable) == FLVD_META_KEY_NONE + 1, "one entry per key, and the end");

constexpr uint8_t FLVD_CASE_BIT = 0x20; // set in lowercase letters; setting it makes no other byte a letter

// True when a name of the key's length is the key, ignoring case.
bool FLVD_IsKey(const uint8_t* name, const flvd_meta_key_t& key)
{
    for (uint32_t i = 0; i < key.length; ++i)
        if ((name[i] | FLVD_CASE_BIT) != key.name[i])
            return false;
    return true;
}

// Index of the first key of a length, or FLVD_META_KEY_NONE, which settles most names in files without a comparison.
uint32_t FLVD_FirstKey(uint32_t length)
{
    switch (length) {
    case 5:
        return FLVD_META_KEY_TIMES;
    case 6:
        return FLVD_META_KEY_HEIGHT;
    case 8:
        return FLVD_META_KEY_DURATION;
    case 9:
        return FLVD_META_KEY_FRAMERATE;
    case 10:
        return FLVD_META_KEY_AUDIODELAY;
    case 13:
        return FLVD_META_KEY_AUDIODATARATE;
    case 15:
        return FLVD_META_KEY_AUDIOSAMPLERATE;
    case 20:
        return FLVD_META_KEY_LASTKEYFRAMELOCATION;
    case 21:
        return FLVD_META_KEY_LASTKEYFRAMETIMESTAMP;
    default:
        return FLVD_META_KEY_NONE;
    }
}

} // namespace

uint32_t FLVD_FindKey(const uint8_t* name, uint32_t length)
{
    for (uint32_t index = FLVD_FirstKey(length); g_flvd_metaKeyTable[index].length == length; ++index)
        if (FLVD_IsKey(name, g_flvd_metaKeyTable[index]))
            return index;
    return FLVD_META_KEY_NONE;
}
