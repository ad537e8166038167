// The keyframe index of the metadata: keeping its arrays in memory or reading their elements from the file, trimming
// them to the valid data, and choosing an entry for a time.
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

// Replaces an array of the instance by one of `count` zeros. When `refused`, or without memory, only frees the old
// array and returns None.
FlvdArray FLVD_ReplaceArray(flvd_ctx_t* ctx, FlvdArray array, uint32_t count, bool refused);

// Stores a number in the current array if it has such an entry: an element parsed in between may have replaced the
// array by a shorter one.
void FLVD_StoreElement(flvd_ctx_t* ctx, FlvdArray array, uint32_t entry, double number);

// The index and the valid data. The functions with an int32_t result return 0, or -1 with the failure recorded, except
// that an index in the file that ends early records nothing.

// True when the index is inside the file and has more than one entry.
bool FLVD_IsIndexUsable(const flvd_ctx_t* ctx);

// Finds the last position before the first one that is outside the file; 0 when there is none. Sets `all_inside` when
// no position is outside, or only the last one.
int32_t FLVD_FindLastInside(flvd_ctx_t* ctx, int64_t* last, bool* all_inside);

// Trims the entries past the end of the valid data, except the first of them, and sets the last keyframe time from the
// entries that remain.
int32_t FLVD_TrimIndex(flvd_ctx_t* ctx, int64_t end);

// Choosing.

enum class FlvdChoice { Entry, Rewind, Miss };

// What the index says about a target time.
struct flvd_choice_t {
    FlvdChoice what;
    uint32_t entry;
    uint32_t time;
};

// Chooses the entry at or before (`backward`) or at or after the target. For an index in the file, the main reader must
// stand at the first element of the times.
flvd_choice_t FLVD_ChooseEntry(const flvd_ctx_t* ctx, FlvdIndex index, uint32_t target, bool backward);

// Reads the position of an entry. Returns 0, or -1 with the failure recorded.
int32_t FLVD_ReadPosition(flvd_ctx_t* ctx, FlvdIndex index, uint32_t entry, int64_t* position);

#endif
