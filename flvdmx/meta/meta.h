// Metadata: script data (AMF0) and the keyframe index in it. This header holds the state of one parse.
//
// Files: script.cpp parses values, keys.cpp recognises property names, properties.cpp stores what they say in the
// instance, keyframe_index.cpp keeps, reads and trims the index. amf.h has the numbers of AMF0.
#ifndef FLVDMX_META_META_H
#define FLVDMX_META_META_H

#include "flvdmx/flvdmx.h"

#include <cstring>

constexpr uint32_t FLVD_META_TEXT_MAX = 255;   // longer keys and texts are skipped unread
constexpr uint32_t FLVD_META_ARRAY_HEADER = 5; // type marker and count

// Parse of one payload.
struct flvd_script_state_t {
    uint32_t flags;
    uint32_t array_count;          // elements of the strict array begun last
    uint32_t value_type;           // marker of the value being parsed
    uint8_t value[sizeof(double)]; // the last number; other types overwrite its first bytes, or nothing
    uint32_t pending_key;          // the property whose value is being parsed
    uint32_t length;               // of the payload
    uint64_t consumed;             // bytes of it, and of what lies after it when a value runs over
    uint32_t containers;           // open at present
    uint64_t kept_elements;        // of all keyframe arrays that were not refused
    uint8_t scratch[FLVD_META_TEXT_MAX];
};

inline double FLVD_SlotNumber(const flvd_script_state_t* state)
{
    double number = 0.0;
    std::memcpy(&number, state->value, sizeof number);
    return number;
}

// What meeting a key does before its value is parsed. An unknown key inside a known property ends it: the property
// takes the number parsed last.
void FLVD_MeetKey(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t key);

// Gives the pending property the number in the slot, whatever type its value had.
void FLVD_AssignPendingKey(flvd_ctx_t* ctx, flvd_script_state_t* state);

#endif
