// AVC: the AVCDecoderConfigurationRecord (ISO/IEC 14496-15) and the picture size in a sequence parameter set
// (ISO/IEC 14496-10, 7.3.2.1.1). The fields of a set are not validated: a damaged set gives a wrong picture size.
//
// The parser reads a set as it is stored, without removing emulation_prevention_three_byte: the bytes 00 00 03 before
// the picture size are so rare that removing them is left to decoders. All fields are read, used or not, because each
// one's length decides where the next one begins.

#include "flvdmx/codec/codec.h"
#include "flvdmx/common/bytes.h"

#include <cstring>

namespace {

// AVCDecoderConfigurationRecord.
// configurationVersion, AVCProfileIndication, profile_compatibility, AVCLevelIndication, lengthSizeMinusOne, the count
// of sequence parameter sets, and one more byte. The NAL unit length size is not needed here: parameter sets always
// have 16-bit lengths.
constexpr int32_t FLVD_AVCC_MIN = 7;
constexpr uint8_t FLVD_AVCC_VERSION = 1;
constexpr int32_t FLVD_AVCC_SPS_COUNT = 5; // offset of numOfSequenceParameterSets
constexpr uint32_t FLVD_AVCC_SPS_COUNT_MASK = 0x1F;

constexpr uint8_t g_flvd_startCode[] = {0, 0, 0, 1};

// Progress of converting a record to start codes. The record's counts and lengths are not trusted.
struct flvd_avcc_t {
    const uint8_t* in;
    int32_t in_left;
    uint8_t* out;
    int32_t out_left;
};

// Copies `count` parameter sets. False when the record ends first or the output is full.
bool FLVD_CopyParameterSets(flvd_avcc_t* avcc, uint32_t count)
{
    for (; count != 0; --count) {
        if (avcc->in_left < 2)
            return false;
        const auto length = static_cast<int32_t>(FLVD_GetBE16(avcc->in));
        constexpr auto prefix = static_cast<int32_t>(sizeof g_flvd_startCode);
        if (length > avcc->in_left - 2 || length > avcc->out_left - prefix)
            return false;
        std::memcpy(avcc->out, g_flvd_startCode, sizeof g_flvd_startCode);
        std::memcpy(avcc->out + prefix, avcc->in + 2, static_cast<size_t>(length));
        avcc->in += 2 + length;
        avcc->in_left -= 2 + length;
        avcc->out += prefix + length;
        avcc->out_left -= prefix + length;
    }
    return true;
}

// Sequence parameter set.
constexpr int32_t FLVD_SPS_SEARCH_MIN = 5; // start code, NAL header and one byte
constexpr uint32_t FLVD_NAL_TYPE_MASK = 0x1F;
constexpr uint32_t FLVD_NAL_SPS = 7;
constexpr uint32_t FLVD_UE_MAX_ZEROS = 32;
constexpr uint32_t FLVD_UE_IN_WINDOW = 1u << 19; // at most 12 leading zeros, so the code has at most 25 bits
constexpr uint32_t FLVD_UE_INVALID = 0xFFFFFFFF; // stands for a code longer than the standard allows
constexpr uint32_t FLVD_SCALING_LISTS = 8;       // for 4:4:4 too, although later editions have twelve there
constexpr uint32_t FLVD_SCALING_LISTS_4X4 = 6;
constexpr uint32_t FLVD_POC_CYCLE_MAX = 255;
constexpr uint32_t FLVD_CHROMA_420 = 1;
constexpr uint32_t FLVD_CHROMA_444 = 3;

// SubWidthC and SubHeightC by chroma_format_idc, ISO/IEC 14496-10 table 6-1.
struct flvd_crop_unit_t {
    int8_t x;
    int8_t y;
};
constexpr flvd_crop_unit_t g_flvd_cropUnit[] = {{1, 1}, {2, 2}, {2, 1}, {1, 1}};

// Process-wide, which is safe because opens never run concurrently and every parse starts by resetting it.
struct flvd_sps_bits_t {
    int32_t bit_pos;      // next bit, counted from start
    const uint8_t* start; // payload after the NAL header byte
};
flvd_sps_bits_t g_flvd_spsBits;
int32_t g_flvd_spsSize; // bytes from start on, set together with it; bits past them read as 0

uint32_t FLVD_SpsByte(int32_t index)
{
    return index < g_flvd_spsSize ? g_flvd_spsBits.start[index] : 0u;
}

// The next bits, left-aligned, from the four bytes at the position: the upper 25 are exact at any bit position, the
// rest may be 0. The second case loads three bytes, because there the fourth is past the end and reads as 0.
inline uint32_t FLVD_SpsWindow()
{
    const int32_t byte = g_flvd_spsBits.bit_pos >> 3;
    const uint32_t window = byte <= g_flvd_spsSize - 4
                                ? FLVD_GetBE32(g_flvd_spsBits.start + byte)
                                : FLVD_SpsByte(byte) << 24 | FLVD_SpsByte(byte + 1) << 16 | FLVD_SpsByte(byte + 2) << 8;
    return window << (static_cast<uint32_t>(g_flvd_spsBits.bit_pos) & 7u);
}

// u(n). Exact up to 25 bits; in a longer field the low bits may read as 0.
uint32_t FLVD_SpsGetBits(uint32_t n)
{
    const uint32_t window = FLVD_SpsWindow();
    g_flvd_spsBits.bit_pos += static_cast<int32_t>(n);
    return n == 0 ? 0 : window >> (32 - n);
}

// ue(v), ISO/IEC 14496-10, 9.1.
uint32_t FLVD_SpsGetUE()
{
    const uint32_t window = FLVD_SpsWindow();
    if (window >= FLVD_UE_IN_WINDOW) {
        const int32_t prefix = __builtin_clz(window);
        g_flvd_spsBits.bit_pos += 2 * prefix + 1;
        return (window >> (31 - 2 * prefix)) - 1;
    }
    uint32_t zeros = 0;
    while (FLVD_SpsGetBits(1) == 0)
        if (++zeros == FLVD_UE_MAX_ZEROS)
            return FLVD_UE_INVALID;
    return (1u << zeros) - 1 + FLVD_SpsGetBits(zeros);
}

// se(v), in 64 bits because FLVD_UE_INVALID maps to a value outside 32 bits.
int64_t FLVD_SpsGetSE()
{
    const int64_t k = FLVD_SpsGetUE();
    return (k & 1) != 0 ? (k + 1) / 2 : -(k / 2);
}

// scaling_list(), 7.3.2.1.1.1: once nextScale is 0, the rest of the list repeats the last value and has no bits.
void FLVD_SpsSkipScalingList(uint32_t size)
{
    uint32_t last = 8;
    uint32_t next = 8;
    for (; size != 0; --size) {
        if (next != 0)
            next = (last + static_cast<uint32_t>(static_cast<uint64_t>(FLVD_SpsGetSE()))) & 0xFF; // modulo 256
        if (next != 0)
            last = next;
    }
}

void FLVD_SpsSkipScalingMatrix()
{
    for (uint32_t i = 0; i < FLVD_SCALING_LISTS; ++i)
        if (FLVD_SpsGetBits(1) != 0) // seq_scaling_list_present_flag
            FLVD_SpsSkipScalingList(i < FLVD_SCALING_LISTS_4X4 ? 16 : 64);
}

// Reads the fields that only the high profiles have. Returns chroma_format_idc.
uint32_t FLVD_SpsReadHighProfile()
{
    const uint32_t chroma_format_idc = FLVD_SpsGetUE();
    if (chroma_format_idc == FLVD_CHROMA_444)
        FLVD_SpsGetBits(1); // separate_colour_plane_flag
    FLVD_SpsGetUE();        // bit_depth_luma_minus8
    FLVD_SpsGetUE();        // bit_depth_chroma_minus8
    FLVD_SpsGetBits(1);     // qpprime_y_zero_transform_bypass_flag
    if (FLVD_SpsGetBits(1) != 0)
        FLVD_SpsSkipScalingMatrix();
    return chroma_format_idc;
}

// Skips the picture order count fields. False when the cycle is longer than the standard allows.
bool FLVD_SpsSkipPictureOrder()
{
    const uint32_t type = FLVD_SpsGetUE(); // pic_order_cnt_type
    if (type == 0)
        FLVD_SpsGetUE(); // log2_max_pic_order_cnt_lsb_minus4
    if (type != 1)
        return true;
    FLVD_SpsGetBits(1); // delta_pic_order_always_zero_flag
    FLVD_SpsGetSE();    // offset_for_non_ref_pic
    FLVD_SpsGetSE();    // offset_for_top_to_bottom_field
    const uint32_t frames = FLVD_SpsGetUE();
    if (frames > FLVD_POC_CYCLE_MAX)
        return false;
    for (uint32_t i = 0; i < frames; ++i)
        FLVD_SpsGetSE(); // offset_for_ref_frame
    return true;
}

// Reads the fields from pic_width_in_mbs_minus1 on. The arithmetic is unsigned, so damaged values wrap around.
void FLVD_SpsReadSize(uint32_t chroma_format_idc, flvd_video_info_t* info)
{
    const uint32_t width_in_mbs = FLVD_SpsGetUE() + 1;
    const uint32_t height_in_map_units = FLVD_SpsGetUE() + 1;
    const uint32_t frame_mbs_only = FLVD_SpsGetBits(1);
    if (frame_mbs_only == 0)
        FLVD_SpsGetBits(1); // mb_adaptive_frame_field_flag
    FLVD_SpsGetBits(1);     // direct_8x8_inference_flag
    uint32_t crop_x = 0;
    uint32_t crop_y = 0;
    if (FLVD_SpsGetBits(1) != 0) { // frame_cropping_flag
        crop_x = FLVD_SpsGetUE();
        crop_x += FLVD_SpsGetUE();
        crop_y = FLVD_SpsGetUE();
        crop_y += FLVD_SpsGetUE();
    }
    // frame_crop_*_offset count chroma samples, and in field coding twice as many lines: CropUnitX and CropUnitY,
    // equations 7-19 to 7-22. Pictures are whole macroblocks of 16 x 16, and pic_height_in_map_units_minus1 counts
    // pairs of them when frames may be coded as fields.
    const bool known = chroma_format_idc <= FLVD_CHROMA_444;
    const flvd_crop_unit_t unit = known ? g_flvd_cropUnit[chroma_format_idc] : flvd_crop_unit_t{1, 1};
    const uint32_t fields = 2 - frame_mbs_only;
    info->width = 16 * width_in_mbs - static_cast<uint32_t>(unit.x) * crop_x;
    info->height = 16 * fields * height_in_map_units - static_cast<uint32_t>(unit.y) * fields * crop_y;
}

// Offset of the first sequence parameter set after its NAL header byte, or -1.
int32_t FLVD_FindSps(const uint8_t* data, int32_t length)
{
    for (int32_t p = 0; p <= length - FLVD_SPS_SEARCH_MIN; ++p)
        if (FLVD_GetBE24(data + p) == 1 && (data[p + 3] & FLVD_NAL_TYPE_MASK) == FLVD_NAL_SPS)
            return p + 4;
    return -1;
}

} // namespace

int32_t FLVD_GetAVCSeqHeaderFromAvcC(const uint8_t* record, int32_t length, uint8_t* out, int32_t capacity)
{
    if (length < FLVD_AVCC_MIN || record[0] != FLVD_AVCC_VERSION || capacity < 0)
        return 0;
    // The upper three bits of the count byte are reserved, ones in valid records, and are ignored.
    constexpr int32_t sets = FLVD_AVCC_SPS_COUNT + 1;
    flvd_avcc_t avcc = {record + sets, length - sets, out, capacity};
    if (!FLVD_CopyParameterSets(&avcc, record[FLVD_AVCC_SPS_COUNT] & FLVD_AVCC_SPS_COUNT_MASK))
        return 0;
    if (avcc.in_left < 1)
        return 0;
    const uint32_t pictures = *avcc.in; // numOfPictureParameterSets, all 8 bits
    ++avcc.in;
    --avcc.in_left;
    return FLVD_CopyParameterSets(&avcc, pictures) ? capacity - avcc.out_left : 0;
}

int32_t FLVD_ParseH264SPS(flvd_video_info_t* info, const uint8_t* data, int32_t length)
{
    const int32_t payload = FLVD_FindSps(data, length);
    if (payload < 0)
        return -1;
    g_flvd_spsBits = {0, data + payload};
    g_flvd_spsSize = length - payload;
    const uint32_t profile_idc = FLVD_SpsGetBits(8);
    FLVD_SpsGetBits(8 + 8); // constraint flags, level_idc
    FLVD_SpsGetUE();        // seq_parameter_set_id
    // High, High 10, High 4:2:2 and the former High 4:4:4 (144). Later profiles with these fields, such as High 4:4:4
    // Predictive (244), are read as if they had none, so their picture size is wrong.
    const bool high = profile_idc == 100 || profile_idc == 110 || profile_idc == 122 || profile_idc == 144;
    const uint32_t chroma_format_idc = high ? FLVD_SpsReadHighProfile() : FLVD_CHROMA_420;
    FLVD_SpsGetUE(); // log2_max_frame_num_minus4
    if (!FLVD_SpsSkipPictureOrder())
        return -1;
    FLVD_SpsGetUE();    // max_num_ref_frames
    FLVD_SpsGetBits(1); // gaps_in_frame_num_value_allowed_flag
    FLVD_SpsReadSize(chroma_format_idc, info);
    std::memcpy(info->fourcc, "H264", sizeof info->fourcc);
    return 0;
}
