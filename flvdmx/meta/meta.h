// Metadata: script data (AMF0) and the keyframe index in it. This header has the state of one parse.
//
// Files: script.cpp parses values, keys.cpp recognises property names, properties.cpp stores their values in the
// instance, keyframe_index.cpp keeps, reads and trims the index, amf.h has the constants and numbers of AMF0.
#ifndef FLVDMX_META_META_H
#define FLVDMX_META_META_H

#include "flvdmx/flvdmx.h"

#include <cstring>

constexpr uint32_t FLVD_META_TEXT_MAX = 255;   // longer keys and strings are skipped without reading them
constexpr uint32_t FLVD_META_ARRAY_HEADER = 5; // type marker and count

// State of parsing one payload.
struct flvd_script_state_t {
    uint32_t flags;
    uint32_t array_count;          // elements of the strict array entered last
    uint32_t value_type;           // marker of the value being parsed
    uint8_t value[sizeof(double)]; // the last number; a value of another type overwrites some of its bytes, or none
    uint32_t pending_key;          // the property whose value is being parsed
    uint32_t length;               // bytes of the payload
    uint64_t consumed;             // bytes consumed; more than length when a value runs past the payload
    uint32_t containers;           // nesting depth
    uint64_t kept_elements;        // elements of all keyframe arrays that were not refused
    uint8_t scratch[FLVD_META_TEXT_MAX];
};

inline double FLVD_SlotNumber(const flvd_script_state_t* state)
{
    double number = 0.0;
    std::memcpy(&number, state->value, sizeof number);
    return number;
}

// Handles a key before its value is parsed. An unknown key inside the value of a known property ends that property,
// which takes the last number parsed.
void FLVD_MeetKey(flvd_ctx_t* ctx, flvd_script_state_t* state, uint32_t key);

// Assigns the last number parsed to the pending property, whatever type the property's value has.
void FLVD_AssignPendingKey(flvd_ctx_t* ctx, flvd_script_state_t* state);

#endif
