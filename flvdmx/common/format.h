// Constants of the FLV format that several layers use (FLV file format, version 10.1, annex E).
//
// This folder holds what all layers share. Other files: tag_header.h (the header of a tag), bytes.h (big-endian
// fields), instance.h (queries on an instance), sites.def (failure sites).
#ifndef FLVDMX_COMMON_FORMAT_H
#define FLVDMX_COMMON_FORMAT_H

#include <cstdint>

// A tag is a header, DataSize bytes of data, and the back-pointer (PreviousTagSize), DataSize + 11 in a valid file.
constexpr uint32_t FLVD_TAG_HEADER_SIZE = 11;
constexpr uint32_t FLVD_BACK_POINTER_SIZE = 4;
constexpr uint32_t FLVD_TAG_OVERHEAD = FLVD_TAG_HEADER_SIZE + FLVD_BACK_POINTER_SIZE; // all but the data

// Codec byte of video: FrameType in the high four bits, CodecID in the low four.
constexpr uint32_t FLVD_FRAME_TYPE_SHIFT = 4;
enum : uint32_t { FLVD_FRAME_TYPE_KEY = 1, FLVD_FRAME_TYPE_GENERATED_KEY = 4 };
constexpr uint32_t FLVD_CODEC_BYTE_MAX = 0x5F; // FrameType 5, any CodecID
constexpr uint32_t FLVD_CODEC_ID_MASK = 0x0F;
enum : uint32_t {
    FLVD_CODEC_JPEG = 1,
    FLVD_CODEC_H263 = 2, // Sorenson
    FLVD_CODEC_SCREEN = 3,
    FLVD_CODEC_VP6 = 4,
    FLVD_CODEC_VP6_ALPHA = 5,
    FLVD_CODEC_SCREEN2 = 6,
    FLVD_CODEC_AVC = 7
};

// Codec byte of audio: SoundFormat in the high four bits, then SoundRate, SoundSize and SoundType.
constexpr uint32_t FLVD_SOUND_FORMAT_SHIFT = 4;
enum : uint32_t { FLVD_SOUND_MP3 = 2, FLVD_SOUND_AAC = 10, FLVD_SOUND_MP3_8KHZ = 14 };

// AACPacketType and AVCPacketType.
constexpr uint32_t FLVD_PACKET_SEQUENCE_HEADER = 0; // the codec configuration
constexpr uint32_t FLVD_PACKET_END_OF_SEQUENCE = 2; // AVC only

// Bytes of the codec header between the tag header and the frame.
constexpr uint32_t FLVD_AVC_HEADER_SIZE = 5; // codec byte, packet type, CompositionTime
constexpr uint32_t FLVD_AAC_HEADER_SIZE = 2; // codec byte, packet type
constexpr uint32_t FLVD_CODEC_HEADER_SIZE = 1;

// True for AVC tags that carry no picture.
constexpr bool FLVD_IsPicturelessPacket(uint32_t packet_type)
{
    return packet_type == FLVD_PACKET_SEQUENCE_HEADER || packet_type == FLVD_PACKET_END_OF_SEQUENCE;
}

// Size of a media tag's codec header; 0 when the tag carries no frame (a configuration or an end of sequence).
constexpr uint32_t FLVD_CodecHeaderSize(bool video, uint32_t codec_byte, uint32_t packet_type)
{
    if (video) {
        if ((codec_byte & FLVD_CODEC_ID_MASK) != FLVD_CODEC_AVC)
            return FLVD_CODEC_HEADER_SIZE;
        return FLVD_IsPicturelessPacket(packet_type) ? 0 : FLVD_AVC_HEADER_SIZE;
    }
    if (codec_byte >> FLVD_SOUND_FORMAT_SHIFT != FLVD_SOUND_AAC)
        return FLVD_CODEC_HEADER_SIZE;
    return packet_type == FLVD_PACKET_SEQUENCE_HEADER ? 0 : FLVD_AAC_HEADER_SIZE;
}

#endif
