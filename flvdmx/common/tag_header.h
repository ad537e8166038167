// The header of a tag, parsed: its fields, and the two bytes after it that say what the tag carries.
#ifndef FLVDMX_COMMON_TAG_HEADER_H
#define FLVDMX_COMMON_TAG_HEADER_H

#include "flvdmx/common/bytes.h"
#include "flvdmx/common/format.h"
#include "flvdmx/flvdmx.h"

// Offsets in a tag (FLV file format, version 10.1, annex E.4.1).
constexpr uint32_t FLVD_DATA_SIZE_OFFSET = 1;    // 24 bits
constexpr uint32_t FLVD_TIMESTAMP_OFFSET = 4;    // 24 bits, then TimestampExtended
constexpr uint32_t FLVD_STREAM_ID_OFFSET = 8;    // 24 bits
constexpr uint32_t FLVD_CODEC_BYTE_OFFSET = 11;  // first data byte: frame type and codec
constexpr uint32_t FLVD_PACKET_TYPE_OFFSET = 12; // AAC and AVC only

constexpr uint32_t FLVD_TAG_PEEK_SIZE = FLVD_PACKET_TYPE_OFFSET + 1; // bytes needed to parse a header

struct flvd_tag_header_t {
    flvd_tag_info_t info;
    uint8_t codec_byte;  // video: FrameType, CodecID; audio: SoundFormat, SoundRate, SoundSize, SoundType
    uint8_t packet_type; // AVCPacketType or AACPacketType

    uint32_t CodecId() const { return codec_byte & FLVD_CODEC_ID_MASK; }
    uint32_t FrameType() const { return uint32_t{codec_byte} >> FLVD_FRAME_TYPE_SHIFT; }
    uint32_t SoundFormat() const { return uint32_t{codec_byte} >> FLVD_SOUND_FORMAT_SHIFT; }
    bool IsVideo() const { return info.type == FLVD_TAG_TYPE_VIDEO; }
    bool IsAudio() const { return info.type == FLVD_TAG_TYPE_AUDIO; }
    bool IsKeyframe() const
    {
        return FrameType() == FLVD_FRAME_TYPE_KEY || FrameType() == FLVD_FRAME_TYPE_GENERATED_KEY;
    }
    bool IsAvc() const { return CodecId() == FLVD_CODEC_AVC; }
    bool IsAac() const { return SoundFormat() == FLVD_SOUND_AAC; }
    // A sequence header, or a tag of a codec that has none.
    bool IsAvcConfigOrOther() const { return !IsAvc() || packet_type == FLVD_PACKET_SEQUENCE_HEADER; }
    bool IsAacConfigOrOther() const { return !IsAac() || packet_type == FLVD_PACKET_SEQUENCE_HEADER; }
    // An AVC tag that carries no picture.
    bool IsPictureless() const { return IsVideo() && IsAvc() && FLVD_IsPicturelessPacket(packet_type); }
    uint32_t CodecHeaderSize() const { return FLVD_CodecHeaderSize(IsVideo(), codec_byte, packet_type); }
};

// Timestamp of an 11-byte tag header. TimestampExtended, its top byte, comes after the other three.
[[gnu::always_inline]] constexpr uint32_t FLVD_TagTimestamp(const uint8_t* bytes)
{
    const uint32_t field = FLVD_GetBE32(bytes + FLVD_TIMESTAMP_OFFSET);
    return field >> 8 | field << 24;
}

// Parses a header from FLVD_TAG_PEEK_SIZE bytes.
inline flvd_tag_header_t FLVD_ReadTagHeader(const uint8_t* bytes)
{
    const uint32_t type_and_size = FLVD_GetBE32(bytes);
    return {
        {type_and_size >> 24, type_and_size & 0xFFFFFF, FLVD_TagTimestamp(bytes),
         FLVD_GetBE32(bytes + FLVD_STREAM_ID_OFFSET) >> 8},
        bytes[FLVD_CODEC_BYTE_OFFSET],
        bytes[FLVD_PACKET_TYPE_OFFSET],
    };
}

// True when the four bytes are the back-pointer of a tag with data_size bytes of data.
constexpr bool FLVD_IsBackPointer(const uint8_t* bytes, uint32_t data_size)
{
    return FLVD_GetBE32(bytes) == data_size + FLVD_TAG_HEADER_SIZE;
}

#endif
