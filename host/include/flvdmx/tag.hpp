/*
 * Tags, the pieces that an FLV file consists of: streams, codecs, and the tag header (FLV file format, version 10.1,
 * annex E.4). For C++17. You rarely need tags to play a file, since flvdmx::File delivers frames; to look at them:
 *
 *     file.for_each_tag([](const flvdmx::Tag& tag) {
 *         std::printf("%lld: %u bytes\n", static_cast<long long>(tag.position), tag.data_size());
 *         return true;
 *     });
 */
#ifndef FLVDMX_TAG_HPP
#define FLVDMX_TAG_HPP

#include "flvdmx/layers.h"
#include "flvdmx/result.hpp"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace flvdmx {

/** A stream. */
enum class Stream : uint32_t {
    any = 0,                   /**< either stream */
    video = FLVD_STREAM_VIDEO, /**< video */
    audio = FLVD_STREAM_AUDIO  /**< audio */
};

/** CodecID of video tags (FLV file format, version 10.1, annex E.4.3.1). Files may contain other values. */
enum class VideoCodec : uint32_t {
    unknown = 0,        /**< none */
    jpeg = 1,           /**< JPEG */
    sorenson_h263 = 2,  /**< Sorenson H.263 */
    screen_video = 3,   /**< screen video */
    vp6 = 4,            /**< VP6 */
    vp6_alpha = 5,      /**< VP6 with an alpha channel */
    screen_video_2 = 6, /**< screen video, version 2 */
    avc = 7             /**< AVC, H.264 */
};

/** SoundFormat of audio tags (annex E.4.2.1). Files may contain other values. */
enum class AudioCodec : uint32_t {
    pcm = 0,               /**< linear PCM, byte order of the machine that wrote it */
    adpcm = 1,             /**< ADPCM */
    mp3 = 2,               /**< MP3 */
    pcm_little_endian = 3, /**< linear PCM, little-endian */
    nellymoser_16khz = 4,  /**< Nellymoser, 16 kHz, mono */
    nellymoser_8khz = 5,   /**< Nellymoser, 8 kHz, mono */
    nellymoser = 6,        /**< Nellymoser */
    a_law = 7,             /**< G.711 A-law */
    mu_law = 8,            /**< G.711 mu-law */
    unknown = 9,           /**< reserved */
    aac = 10,              /**< AAC */
    speex = 11,            /**< Speex */
    mp3_8khz = 14,         /**< MP3, 8 kHz */
    device_specific = 15   /**< device-specific sound */
};

/** @return the codec's name in plain words; "unknown" for a value that the format does not define */
constexpr const char* name(VideoCodec codec)
{
    constexpr std::array names = {"unknown", "JPEG",           "Sorenson H.263", "screen video",
                                  "VP6",     "VP6 with alpha", "screen video 2", "H.264 (AVC)"};
    const auto number = static_cast<size_t>(codec);
    return number < names.size() ? names[number] : names[0];
}

/** @return the same for audio */
constexpr const char* name(AudioCodec codec)
{
    constexpr std::array names = {"PCM",
                                  "ADPCM",
                                  "MP3",
                                  "PCM, little-endian",
                                  "Nellymoser 16 kHz mono",
                                  "Nellymoser 8 kHz mono",
                                  "Nellymoser",
                                  "G.711 A-law",
                                  "G.711 mu-law",
                                  "unknown",
                                  "AAC",
                                  "Speex",
                                  "unknown",
                                  "unknown",
                                  "MP3 8 kHz",
                                  "device-specific sound"};
    const auto number = static_cast<size_t>(codec);
    return number < names.size() ? names[number] : "unknown";
}

/**
 * A tag header and the codec header after it. A tag consists of the header, the payload and a back-pointer, which
 * states the size of header and payload. The payload of a video or audio tag starts with the codec header.
 */
class Tag {
public:
    static constexpr uint32_t header_size = 11;      /**< bytes before the payload */
    static constexpr uint32_t back_pointer_size = 4; /**< bytes after the payload (PreviousTagSize) */
    static constexpr size_t bytes_used = 16;         /**< bytes that this class examines */

    int64_t position = -1; /**< file position of the header; -1: no tag */

    Tag() = default; /**< no tag */
    /** Takes the tag whose header starts with `bytes`. Missing bytes count as 0; nothing is checked. */
    Tag(int64_t at, Bytes bytes) : position(at)
    {
        std::copy_n(bytes.begin(), std::min(bytes.size(), bytes_used), m_bytes.begin());
    }

    uint8_t type() const { return m_bytes[0]; }                       /**< FLVD_TAG_TYPE_* in valid files */
    bool is_video() const { return type() == FLVD_TAG_TYPE_VIDEO; }   /**< by its type */
    bool is_audio() const { return type() == FLVD_TAG_TYPE_AUDIO; }   /**< by its type */
    bool is_script() const { return type() == FLVD_TAG_TYPE_SCRIPT; } /**< by its type */
    /** @return Stream::any for other types than video and audio */
    Stream stream() const { return is_video() ? Stream::video : is_audio() ? Stream::audio : Stream::any; }
    uint32_t data_size() const { return word(0) & 0xFFFFFF; }                        /**< bytes of payload */
    uint32_t timestamp() const { return word(4) >> 8 | uint32_t{m_bytes[7]} << 24; } /**< of the file, in ms */
    uint32_t stream_id() const { return word(8) >> 8; }                              /**< 0 in valid files */

    int64_t data_position() const { return position + header_size; }   /**< file position of the payload */
    int64_t data_end() const { return data_position() + data_size(); } /**< file position of the back-pointer */
    int64_t end() const { return data_end() + back_pointer_size; }     /**< file position after the tag */

    /** The first byte of the payload: frame type and CodecID, or sound format; 0 without payload. */
    uint8_t codec_byte() const { return data_size() != 0 ? first() : uint8_t{0}; }
    /** CodecID of a video tag. */
    VideoCodec video_codec() const { return static_cast<VideoCodec>(codec_byte() & 15); }
    /** SoundFormat of an audio tag. */
    AudioCodec audio_codec() const { return static_cast<AudioCodec>(codec_byte() >> 4); }
    /** True for AVC video. */
    bool is_avc() const { return is_video() && (first() & 15) == static_cast<uint8_t>(VideoCodec::avc); }
    /** True for AAC audio. */
    bool is_aac() const { return is_audio() && first() >> 4 == static_cast<uint8_t>(AudioCodec::aac); }
    /** @return the bytes of payload before the frame: codec, packet type, composition time offset */
    uint32_t codec_header_size() const { return is_avc() ? 5 : is_aac() ? 2 : 1; }
    /** True for a video tag with the header of enhanced FLV, in which a FourCC names the codec. */
    bool is_enhanced() const { return is_video() && codec_byte() >= 0x80; }
    /** The FourCC of enhanced FLV; valid while the Tag lives. */
    std::string_view fourcc() const { return {reinterpret_cast<const char*>(&m_bytes[header_size + 1]), 4}; }

    /** True for an AVC or AAC tag that carries a codec configuration. */
    bool is_config() const { return (is_avc() || is_aac()) && packet_type() == 0; }
    /** True for a video or audio tag that carries a frame: no configuration, no end of an AVC sequence. */
    bool has_frame() const
    {
        return stream() != Stream::any && data_size() >= codec_header_size() && !is_config() &&
               !(is_avc() && packet_type() == 2);
    }
    /** @return the bytes of the frame; 0 if there is none */
    uint32_t frame_size() const { return has_frame() ? data_size() - codec_header_size() : 0; }
    /** True if the frame can be decoded without earlier ones: always for audio. */
    bool is_keyframe() const { return is_audio() || first() >> 4 == 1 || first() >> 4 == 4; }
    /** @return presentation time minus timestamp in ms; 0 unless AVC */
    int32_t composition_offset() const
    {
        constexpr int32_t sign = 1 << 23;
        return is_avc() ? (static_cast<int32_t>(word(12) & 0xFFFFFF) ^ sign) - sign : 0;
    }

private:
    friend class File;

    // True if this is the tag of a payload of this size, after which the reader stands at `payload_end`.
    bool has_payload(Stream of, uint32_t payload, int64_t payload_end) const
    {
        const uint32_t type = of == Stream::video ? FLVD_TAG_TYPE_VIDEO : FLVD_TAG_TYPE_AUDIO;
        return word(0) == (type << 24 | payload) && end() == payload_end;
    }
    // Without payload, this is a byte of the back-pointer, which is 0 in a valid tag.
    uint8_t first() const { return m_bytes[header_size]; }
    uint8_t packet_type() const { return m_bytes[header_size + 1]; } // of AVC and AAC
    uint32_t word(size_t at) const
    {
        return uint32_t{m_bytes[at]} << 24 | uint32_t{m_bytes[at + 1]} << 16 | uint32_t{m_bytes[at + 2]} << 8 |
               m_bytes[at + 3];
    }

    std::array<uint8_t, bytes_used> m_bytes{};
};

} // namespace flvdmx

#endif /* FLVDMX_TAG_HPP */
