// The keyframe index of the metadata: the arrays in memory, reading their elements from the file, trimming them to the
// valid data, and choosing an entry for a time.
#ifndef FLVDMX_META_KEYFRAME_INDEX_H
#define FLVDMX_META_KEYFRAME_INDEX_H

#include "flvdmx/flvdmx.h"

// Where the index is read from.
enum class FlvdIndex { InFile, InMemory };

// True when both arrays are in memory.
inline bool FLVD_IsIndexInMemory(const flvd_ctx_t* ctx)
{
    return ctx->keyframe_arrays.times_ms != nullptr && ctx->keyframe_arrays.positions != nullptr;
}

// The arrays in memory.

enum class FlvdArray { None, Times, Positions };

// Replaces an array of the instance by one of `count` zeros. Without memory, or when it is refused, there is none after
// that: None is returned.
FlvdArray FLVD_ReplaceArray(flvd_ctx_t* ctx, FlvdArray array, uint32_t count, bool refused);

// Stores a number in the array that stands now, unless that is shorter: an element parsed before may have replaced it.
void FLVD_StoreElement(flvd_ctx_t* ctx, FlvdArray array, uint32_t entry, double number);

// The index and the valid data. All return 0, or -1 with the failure recorded, except that an index in the file that
// ends early records nothing.

// True when the index has entries to seek by, and lies inside the file.
bool FLVD_IsIndexUsable(const flvd_ctx_t* ctx);

// Finds the last position before the first one outside the file; 0 when there is none. `all_inside` tells
// whether no position but perhaps the last one lies outside.
int32_t FLVD_FindLastInside(flvd_ctx_t* ctx, int64_t* last, bool* all_inside);

// Cuts off the entries past the end of the valid data, except the first of them, and takes the last keyframe time from
// what is left.
int32_t FLVD_TrimIndex(flvd_ctx_t* ctx, int64_t end);

// Choosing.

enum class FlvdChoice { Entry, Rewind, Miss };

// What the index says about a time.
struct flvd_choice_t {
    FlvdChoice what;
    uint32_t entry;
    uint32_t time;
};

// Chooses the entry at or before (`backward`) or at or after the time. In the file, the main reader stands at the first
// element of the times.
flvd_choice_t FLVD_ChooseEntry(const flvd_ctx_t* ctx, FlvdIndex index, uint32_t target, bool backward);

// Reads the position of an entry. 0, or -1 with the failure recorded.
int32_t FLVD_ReadPosition(flvd_ctx_t* ctx, FlvdIndex index, uint32_t entry, int64_t* position);

#endif
