// The names of the script-data properties that the library knows.
#ifndef FLVDMX_META_KEYS_H
#define FLVDMX_META_KEYS_H

#include <cstdint>

// Indices into the table of keys in keys.cpp.
enum : uint32_t {
    FLVD_META_KEY_TIMES,
    FLVD_META_KEY_WIDTH,
    FLVD_META_KEY_HEIGHT,
    FLVD_META_KEY_DURATION,
    FLVD_META_KEY_FILESIZE,
    FLVD_META_KEY_FRAMERATE,
    FLVD_META_KEY_KEYFRAMES,
    FLVD_META_KEY_AUDIODELAY,
    FLVD_META_KEY_AUDIODATARATE,
    FLVD_META_KEY_FILEPOSITIONS,
    FLVD_META_KEY_LASTTIMESTAMP,
    FLVD_META_KEY_TOTALDURATION,
    FLVD_META_KEY_AUDIOSAMPLERATE,
    FLVD_META_KEY_AUDIOSAMPLESIZE,
    FLVD_META_KEY_LASTKEYFRAMELOCATION,
    FLVD_META_KEY_LASTKEYFRAMETIMESTAMP,
    FLVD_META_KEY_NONE
};

// Returns the key with this name, ignoring case, or FLVD_META_KEY_NONE.
uint32_t FLVD_FindKey(const uint8_t* name, uint32_t length);

#endif
