/*
 * Builds FLV files in memory: tags with correct or deliberately wrong fields, AMF0 values, onMetaData with a keyframe
 * index that has the real positions, and the codec headers that the demuxer reads. The tags written are kept as a list,
 * so that a test can compare them with what was delivered.
 */
#pragma once

#include <algorithm>
#include <cstdint>
#include <functional>
#include <iosfwd>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace flvd_test {

using Bytes = std::vector<uint8_t>;

/** The lowest `bytes` bytes of `value`, most significant first. */
Bytes BigEndian(uint64_t value, int bytes);
inline const auto Append = [](Bytes& out, const Bytes& more) { out.insert(out.end(), more.begin(), more.end()); };
Bytes Concat(const std::vector<Bytes>& parts);
/** Pseudo-random bytes, the same for the same seed, without 8, 9 and 18: no tag header can start in them. */
Bytes Noise(size_t size, uint32_t seed = 1);

/**
 * Bits from words: n/b is n, decimal or 0x.., in b bits, n is ue(n), +n and -n are se(n); k*word is the word k times.
 * Most significant bit first; the last byte is padded with zero bits.
 */
Bytes Bits(const std::string& words);

/**
 * AMF0 values from words: numbers, nan among them; 'text; "long string; { key: value ... } object; < key: value ... >
 * ECMA array; [3 and the three elements; %byte.byte... verbatim; ! a long string that fails right after its length.
 * c^n is the character n times. Brackets need not match.
 */
Bytes Amf(const std::string& words);
/** The string "onMetaData" and an ECMA array of these keys and values. */
inline const auto OnMetaData = [](const std::string& properties) { return Amf("'onMetaData < " + properties + " >"); };

/* Tag data (what follows the 11-byte tag header), including the codec header. */

inline const auto AudioData = [](uint8_t header, const Bytes& payload) { return Concat({{header}, payload}); };
inline const auto VideoData = [](uint32_t frame_type, uint8_t codec, const Bytes& payload) {
    return AudioData(static_cast<uint8_t>(frame_type << 4 | codec), payload);
};
Bytes AvcNalu(bool key, const Bytes& payload, int32_t composition_ms = 0, uint8_t packet_type = 1);
inline const auto AvcConfig = [](const Bytes& record) { return AvcNalu(true, record, 0, 0); };
inline const Bytes g_avc_end = AvcNalu(true, {}, 0, 2);
/* header: SoundFormat 10 with rate, size and type bits; usually 0xAF. */
inline const auto AacConfig = [](const Bytes& config, uint8_t header = 0xAF) { return Concat({{header, 0}, config}); };
inline const auto AacRaw = [](const Bytes& payload, uint8_t header = 0xAF) { return Concat({{header, 1}, payload}); };

/* Codec payloads, without the codec header. */

/** AVCDecoderConfigurationRecord with the given parameter sets. */
Bytes AvcRecord(const std::vector<Bytes>& sps, const std::vector<Bytes>& pps);
/** A record with one baseline parameter set, 320 x 240. */
inline const auto SmallAvcRecord = [] {
    return AvcRecord({{0x67, 0x42, 0xC0, 0x28, 0xDA, 5, 7, 0xE4}}, {{0x68, 0xCE, 0x3C, 0x80}});
};
/** MPEG-1 layer III, 128 kbit/s, 44100 Hz, joint stereo: header and noise. */
inline const auto Mp3Frame = [] { return Concat({{0xFF, 0xFB, 0x90, 0x64}, Noise(196)}); };
/** Sorenson H.263 picture header; size_code 2 to 6: a fixed size. */
inline const auto H263Picture = [](uint32_t size_code) {
    return Concat({Bits("1/17 0/5 1/8 " + std::to_string(size_code) + "/3"), Noise(195)});
};

constexpr uint8_t SOUND_MP3 = 0x2F, SOUND_PCM = 0x3E, SOUND_SPEEX = 0xB2;
constexpr uint8_t CODEC_H263 = 2, CODEC_SCREEN = 3, CODEC_VP6 = 4, CODEC_VP6A = 5;

/** A frame that was delivered or is expected. */
struct Frame {
    uint32_t stream = 0;    /**< 1 video, 2 audio */
    uint32_t timestamp = 0; /**< ms, from the first timestamp */
    Bytes data;

    bool operator==(const Frame&) const = default;
};
using Frames = std::vector<Frame>;
void PrintTo(const Frame& frame, std::ostream* out);

/** A tag to write. */
struct Tag {
    uint8_t type = 0;
    uint32_t timestamp = 0;
    Bytes data;
    std::optional<uint32_t> back_pointer = {}; /**< PreviousTagSize after the tag; default: data size + 11 */
    std::optional<uint32_t> data_size = {};    /**< DataSize in the header; default: that of the data */
    int64_t offset = 0;                        /**< of the tag header; filled by File() */

    int64_t size() const { return static_cast<int64_t>(data.size()) + 15; } /**< header, data and back-pointer */
    int64_t end() const { return offset + size(); }
    /** Size of the codec header: 5, 2 or 1. */
    size_t codec_bytes() const;
    /** The data after them. */
    Bytes frame() const { return {data.begin() + static_cast<std::ptrdiff_t>(codec_bytes()), data.end()}; }
    /** True if it carries a frame: it is neither script data nor a configuration packet, and long enough. */
    bool is_frame() const;
    /** A video frame of FrameType 1. */
    bool is_keyframe() const { return type == 9 && is_frame() && data[0] >> 4 == 1; }
    uint32_t stream() const { return type == 9 ? 1u : 2u; }
};

using Tags = std::vector<Tag>;
inline Tags operator+(Tags first, const Tags& more)
{
    first.insert(first.end(), more.begin(), more.end());
    return first;
}

/* Tags of noise, and the configurations before them. They are function objects, so that tests can pass them on. */

inline const auto Screen = [](uint32_t ts, size_t size = 60) {
    return Tag{9, ts, VideoData(1, CODEC_SCREEN, Noise(size))};
};
inline const auto Nalu = [](uint32_t ts, size_t size = 60) { return Tag{9, ts, AvcNalu(true, Noise(size))}; };
inline const auto Pcm = [](uint32_t ts, size_t size = 60) { return Tag{8, ts, AudioData(SOUND_PCM, Noise(size))}; };
inline const auto Raw = [](uint32_t ts, size_t size = 60) { return Tag{8, ts, AacRaw(Noise(size))}; };
inline const Tag g_avc = {9, 0, AvcConfig(SmallAvcRecord())};
/** A tag whose back-pointer looks like the start of a script tag. */
inline const Tag g_aac = {8, 0, AacConfig({0x12, 0x10, 0x56, 0xE5, 0x00})};
inline const Tag g_meta = {18, 0, OnMetaData("width: 320")};

/** A complete file. */
struct Flv {
    Bytes bytes;
    std::vector<Tag> tags; /**< in file order, with their offsets */

    int64_t size() const { return static_cast<int64_t>(bytes.size()); }
    /** The tags without the file header and the zero back-pointer after it. */
    Bytes body() const { return {bytes.begin() + 13, bytes.end()}; }

    /** The smallest timestamp of the frames, which the library uses as first_ts if all frames count. */
    uint32_t first_ts() const;
    /** The frames that a player receives; streams: bits 1 video, 2 audio. */
    Frames frames(uint32_t streams = 3) const { return frames(streams, first_ts()); }
    Frames frames(uint32_t streams, uint32_t first_ts) const;
};

/** Changes the keyframe index before it is written: times in seconds, positions in bytes. */
using IndexHook = std::function<void(std::vector<double>& times, std::vector<double>& positions)>;

/** A file of these tags; DataOffset leaves room for a file header of `header` bytes after the prefix. */
Flv File(const Tags& tags, uint8_t flags = 5, const Bytes& prefix = {}, uint32_t header = 9);

/** The same, preceded by onMetaData with an index of all keyframes. */
Flv IndexedFile(const Tags& tags, const IndexHook& hook = {}, const std::string& properties = "", uint8_t flags = 5);

/**
 * An ordinary file: AVC and AAC, one keyframe every `gop` frames, both interleaved by time. Video
 * frames have 300 to 400 bytes, audio frames, one every 23 ms, about 90.
 */
struct ChainOptions {
    bool video = true;
    bool audio = true;
    bool metadata = true;
    bool index = false;
    uint32_t pictures = 20; /**< video frames of 40 ms */
    uint32_t gop = 5;
    uint32_t first_ts = 0; /**< of configuration packets and the first frames */
    IndexHook hook = {};   /**< of the index */
};
Flv MakeChain(const ChainOptions& options = {});

} // namespace flvd_test
