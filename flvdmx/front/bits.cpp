// The file-backed bit reader. `bits` holds the next bits left-aligned and ends at a byte boundary. The file's byte
// position is the first byte boundary at or after the bit position, so bits_left / 8 whole bytes of `bits` follow it.
//
// A bit reader invalidated by another access (bits_left is 0) still consumes bytes of the file, and stays empty.
//
// The library itself uses this reader only for the file header. It is exported for tools that parse bit fields of a
// file; codec headers, which are in memory, are read with FLVD_BitStream.

#include "flvdmx/common/bytes.h"
#include "flvdmx/fio/fio.h"

#include <algorithm>

namespace {

constexpr uint32_t FLVD_BIT_CACHE = 64;
constexpr uint32_t FLVD_BIT_REFILL = 32; // refilled by this many bits when no more than this many are left
constexpr uint32_t FLVD_BIT_MAX = 32;    // the longest field

// Every byte access invalidates the bit reader, because it moves the position. With the flag set, the skip
// leaves the bit reader valid.
void FLVD_BitConsumeBytes(fio_file_t* file, uint32_t n)
{
    file->bit_skip_pending = 1;
    __FLV_DMX__fioSkipBytes(n, file);
    file->bit_skip_pending = 0; // a skip that fails (while writing) leaves it set
}

// The four bytes from an index on, with zeros in place of missing bytes.
uint32_t FLVD_BitWord(const uint8_t* bytes, uint32_t from, uint32_t available)
{
    if (available >= from + 4)
        return FLVD_GetBE32(bytes + from);
    uint32_t word = 0;
    for (uint32_t i = from; i < from + 4; ++i)
        word = word << 8 | (i < available ? bytes[i] : 0u);
    return word;
}

// Adds the next 32 bits below the `left` ones that are still valid; both fit in 64 bits.
void FLVD_BitRefill(fio_file_t* file)
{
    const auto left = static_cast<uint32_t>(file->bits_left);
    const uint32_t held = left / 8; // whole bytes after the position that `bits` already holds
    const uint8_t* bytes = nullptr;
    const uint32_t available = FLVD_FioPeek(&bytes, held + FLVD_BIT_REFILL / 8, file);
    const uint64_t word = FLVD_BitWord(bytes, held, available);
    file->bits |= word << (FLVD_BIT_REFILL - left);
    file->bits_left += static_cast<int32_t>(FLVD_BIT_REFILL);
}

// n is at most 32.
void FLVD_BitConsume(fio_file_t* file, uint32_t n)
{
    const bool empty = file->bits_left == 0;
    const auto partial = static_cast<uint32_t>(file->bits_left) % 8; // bits left of a byte that counts as consumed
    if (!empty) {
        file->bits <<= n;
        file->bits_left -= static_cast<int32_t>(n);
    }
    if (n > partial)
        FLVD_BitConsumeBytes(file, (n - partial + 7) / 8);
    if (!empty && file->bits_left <= static_cast<int32_t>(FLVD_BIT_REFILL))
        FLVD_BitRefill(file);
}

} // namespace

int32_t __FLV_DMX__bitInit(fio_file_t* file)
{
    const uint8_t* bytes = nullptr;
    const uint32_t available = FLVD_FioPeek(&bytes, FLVD_BIT_CACHE / 8, file);
    file->bits = uint64_t{FLVD_BitWord(bytes, 0, available)} << 32 | FLVD_BitWord(bytes, 4, available);
    file->bits_left = static_cast<int32_t>(FLVD_BIT_CACHE);
    return 1;
}

uint32_t __FLV_DMX__bitShowBit(fio_file_t* file)
{
    return __FLV_DMX__bitShowUBits(file, 1);
}

uint32_t __FLV_DMX__bitShowUBits(fio_file_t* file, uint32_t n)
{
    n = std::min(n, FLVD_BIT_MAX);
    return n == 0 ? 0 : static_cast<uint32_t>(file->bits >> (FLVD_BIT_CACHE - n));
}

uint32_t __FLV_DMX__bitShowSBits(fio_file_t* file, uint32_t n)
{
    return __FLV_DMX__bitShowUBits(file, n);
}

void __FLV_DMX__bitSkipBits(fio_file_t* file, uint32_t n)
{
    __FLV_DMX__bitSkipBitsLong(file, n);
}

void __FLV_DMX__bitSkipBitsLong(fio_file_t* file, uint32_t n)
{
    if (n <= FLVD_BIT_MAX) {
        FLVD_BitConsume(file, n);
        return;
    }
    const uint32_t ahead = n - static_cast<uint32_t>(file->bits_left) % 8; // bits from the byte position on
    // Too far for `bits`: skip whole bytes in the file and start again there.
    FLVD_BitConsumeBytes(file, ahead / 8);
    __FLV_DMX__bitInit(file);
    const uint32_t rest = ahead % 8;
    if (rest == 0)
        return;
    file->bits <<= rest;
    file->bits_left -= static_cast<int32_t>(rest);
    FLVD_BitConsumeBytes(file, 1);
}

uint32_t __FLV_DMX__bitGetBit(fio_file_t* file)
{
    return __FLV_DMX__bitGetUBits(file, 1);
}

uint32_t __FLV_DMX__bitGetUBits(fio_file_t* file, uint32_t n)
{
    const uint32_t value = __FLV_DMX__bitShowUBits(file, n);
    __FLV_DMX__bitSkipBits(file, n);
    return value;
}

uint32_t __FLV_DMX__bitGetSBits(fio_file_t* file, uint32_t n)
{
    return __FLV_DMX__bitGetUBits(file, n);
}
