// Fields of codec configurations.
#include "tools/codec_config.h"

#include <algorithm>
#include <array>
#include <vector>

#include <fmt/core.h>

namespace tool {

namespace {

constexpr uint32_t ESCAPED_OBJECT_TYPE = 31;
constexpr uint32_t SBR_OBJECT_TYPE = 5; // HE-AAC: output rate and core type follow
constexpr uint32_t PS_OBJECT_TYPE = 29; // HE-AAC version 2, likewise

// Reads a configuration bit by bit; bits past its end are 0.
class Bits {
public:
    explicit Bits(flvdmx::Bytes bytes) : m_bytes(bytes) {}

    uint32_t Take(uint32_t count)
    {
        uint32_t value = 0;
        for (; count > 0; --count, ++m_taken)
            value = value << 1 | (uint32_t{m_bytes[m_taken / 8]} >> (7 - m_taken % 8) & 1U);
        return value;
    }
    uint32_t TakeObjectType()
    {
        const uint32_t objectType = Take(5);
        return objectType == ESCAPED_OBJECT_TYPE ? 32 + Take(6) : objectType;
    }
    uint32_t TakeFrequency(uint32_t index)
    {
        constexpr std::array<uint32_t, AAC_FREQUENCIES> FREQUENCIES = {96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                                                       22050, 16000, 12000, 11025, 8000,  7350};
        constexpr uint32_t EXPLICIT_BITS = 24;
        if (index == AAC_EXPLICIT_FREQUENCY)
            return Take(EXPLICIT_BITS);
        return index < FREQUENCIES.size() ? FREQUENCIES[index] : 0;
    }
    // ue(v) of ISO/IEC 14496-10, 9.1. A code that never ends is cut off after the last bit.
    uint32_t TakeExpGolomb()
    {
        uint32_t zeros = 0;
        while (zeros < 31 && Take(1) == 0)
            ++zeros;
        return (1U << zeros) - 1 + Take(zeros);
    }
    bool AreShort() const { return m_taken > m_bytes.size() * 8; }

private:
    flvdmx::Bytes m_bytes;
    size_t m_taken = 0;
};

// The payload of a NAL unit without the bytes that prevent false start codes: a 3 after two zeros.
std::vector<uint8_t> RemovePrevention(flvdmx::Bytes unit)
{
    std::vector<uint8_t> payload;
    uint32_t zeros = 0;
    for (const uint8_t byte : unit) {
        const bool prevents = zeros >= 2 && byte == 3;
        zeros = byte == 0 ? zeros + 1 : 0;
        if (!prevents)
            payload.push_back(byte);
    }
    return payload;
}

void SkipScalingLists(Bits& bits, uint32_t count)
{
    constexpr uint32_t SMALL_LISTS = 6; // those of 16 values; the others have 64
    for (uint32_t list = 0; list < count; ++list) {
        if (bits.Take(1) == 0)
            continue;
        uint32_t next = 8; // modulo 256; 0 ends the list of differences
        for (uint32_t size = list < SMALL_LISTS ? 16 : 64; size > 0 && next != 0; --size) {
            const uint32_t code = bits.TakeExpGolomb();
            next = (next + (code % 2 != 0 ? (code + 1) / 2 : 0U - code / 2)) & 0xFF;
        }
    }
}

// Reads the fields that only the High profiles have. Returns ChromaArrayType: 0 monochrome or separate planes, 1 4:2:0,
// 2 4:2:2, 3 4:4:4.
uint32_t TakeChromaFormat(Bits& bits)
{
    constexpr uint32_t CHROMA_444 = 3;
    const uint32_t format = bits.TakeExpGolomb();
    const bool separate = format == CHROMA_444 && bits.Take(1) != 0;
    bits.TakeExpGolomb(); // bit_depth_luma_minus8
    bits.TakeExpGolomb(); // bit_depth_chroma_minus8
    bits.Take(1);         // qpprime_y_zero_transform_bypass_flag
    if (bits.Take(1) != 0)
        SkipScalingLists(bits, format == CHROMA_444 ? 12 : 8);
    return separate ? 0 : format;
}

void SkipPictureOrder(Bits& bits)
{
    const uint32_t type = bits.TakeExpGolomb();
    if (type == 0)
        bits.TakeExpGolomb(); // log2_max_pic_order_cnt_lsb_minus4
    if (type != 1)
        return;
    bits.Take(1);         // delta_pic_order_always_zero_flag
    bits.TakeExpGolomb(); // offset_for_non_ref_pic
    bits.TakeExpGolomb(); // offset_for_top_to_bottom_field
    for (uint32_t frames = bits.TakeExpGolomb(); frames > 0 && !bits.AreShort(); --frames)
        bits.TakeExpGolomb(); // offset_for_ref_frame
}

// Size after cropping, from the first sequence parameter set (ISO/IEC 14496-10, 7.3.2.1.1) of the record.
PictureSize AvcPictureSize(flvdmx::Bytes record)
{
    constexpr size_t SET_LENGTH = 6;            // offset of the length of the first set
    constexpr uint32_t MOST_MACROBLOCKS = 1024; // per side; a larger value comes from damage
    constexpr std::array<uint32_t, 13> WITH_CHROMA_FORMAT = {44,  83,  86,  100, 110, 118, 122,
                                                             128, 134, 135, 138, 139, 244};
    const size_t length = size_t{record[SET_LENGTH]} << 8 | record[SET_LENGTH + 1];
    if (length == 0 || record.size() < SET_LENGTH + 2 || length > record.size() - SET_LENGTH - 2)
        return {};
    const std::vector<uint8_t> payload = RemovePrevention({record.data() + SET_LENGTH + 2, length});
    Bits bits({payload.data(), payload.size()});
    bits.Take(8); // NAL unit header
    const uint32_t profile = bits.Take(8);
    bits.Take(16);        // constraints, level_idc
    bits.TakeExpGolomb(); // seq_parameter_set_id
    const bool high =
        std::find(WITH_CHROMA_FORMAT.begin(), WITH_CHROMA_FORMAT.end(), profile) != WITH_CHROMA_FORMAT.end();
    const uint32_t chroma = high ? TakeChromaFormat(bits) : 1;
    bits.TakeExpGolomb(); // log2_max_frame_num_minus4
    SkipPictureOrder(bits);
    bits.TakeExpGolomb(); // max_num_ref_frames
    bits.Take(1);         // gaps_in_frame_num_value_allowed_flag
    const uint32_t columns = bits.TakeExpGolomb() + 1;
    const uint32_t rows = bits.TakeExpGolomb() + 1;
    const uint32_t fields = bits.Take(1) != 0 ? 1 : 2; // frame_mbs_only_flag
    bits.Take(fields);                                 // mb_adaptive_frame_field_flag, direct_8x8_inference_flag
    uint32_t width = columns * 16;
    uint32_t height = rows * 16 * fields;
    if (bits.Take(1) != 0) { // frame_cropping_flag: left, right, top, bottom
        const uint32_t unit = chroma == 1 || chroma == 2 ? 2 : 1;
        width -= bits.TakeExpGolomb() * unit;
        width -= bits.TakeExpGolomb() * unit;
        const uint32_t lines = (chroma == 1 ? 2 : 1) * fields;
        height -= bits.TakeExpGolomb() * lines;
        height -= bits.TakeExpGolomb() * lines;
    }
    const bool plausible = std::max(columns, rows) <= MOST_MACROBLOCKS && width - 1 < columns * 16 &&
                           height - 1 < rows * 16 * fields && !bits.AreShort();
    return plausible ? PictureSize{width, height} : PictureSize{};
}

} // namespace

AacConfig ParseAacConfig(flvdmx::Bytes config)
{
    Bits bits(config);
    AacConfig aac;
    aac.objectType = aac.coreObjectType = bits.TakeObjectType();
    aac.frequencyIndex = bits.Take(4);
    aac.sampleRate = aac.outputSampleRate = bits.TakeFrequency(aac.frequencyIndex);
    aac.channels = bits.Take(4);
    if (aac.objectType == SBR_OBJECT_TYPE || aac.objectType == PS_OBJECT_TYPE) {
        aac.outputSampleRate = bits.TakeFrequency(bits.Take(4));
        aac.coreObjectType = bits.TakeObjectType();
    }
    aac.isShort = bits.AreShort();
    return aac;
}

std::string AacObjectTypeName(uint32_t objectType)
{
    switch (objectType) {
    case 1:
        return "AAC Main";
    case 2:
        return "AAC LC";
    case 3:
        return "AAC SSR";
    case 4:
        return "AAC LTP";
    case SBR_OBJECT_TYPE:
        return "HE-AAC";
    case PS_OBJECT_TYPE:
        return "HE-AAC v2";
    default:
        return fmt::format("object type {}", objectType);
    }
}

std::string AvcProfileName(flvdmx::Bytes record)
{
    constexpr uint8_t CONSTRAINED = 0x40; // constraint_set1_flag
    switch (record[1]) {
    case 66:
        return (record[2] & CONSTRAINED) != 0 ? "Constrained Baseline" : "Baseline";
    case 77:
        return "Main";
    case 88:
        return "Extended";
    case 100:
        return "High";
    case 110:
        return "High 10";
    case 122:
        return "High 4:2:2";
    case 244:
        return "High 4:4:4 Predictive";
    default:
        return fmt::format("profile {}", record[1]);
    }
}

PictureSize PictureSizeOf(const flvdmx::VideoInfo& video)
{
    const PictureSize size = AvcPictureSize(video.config);
    return size.width != 0 ? size : PictureSize{video.width, video.height};
}

std::string AvcLevelName(flvdmx::Bytes record)
{
    return fmt::format("{}.{}", record[3] / 10, record[3] % 10);
}

} // namespace tool
