// Tags (FLV file format, version 10.1, annex E.4.1), read without the library, which may have skipped them.

#include "skipped.h"

#include <array>

namespace flvdmx_gst {

namespace {

constexpr uint32_t tag_header_size = 11;
constexpr uint8_t type_audio = 8;
constexpr uint8_t type_video = 9;
constexpr uint8_t type_script = 18;

uint32_t big_endian_24(const uint8_t* bytes)
{
    return uint32_t{bytes[0]} << 16 | uint32_t{bytes[1]} << 8 | bytes[2];
}

bool is_late(const RawTag& tag, const flvdmx::File& file)
{
    return tag.stream != flvdmx::Stream::any && tag.timestamp > file.instance()->last_ts;
}

} // namespace

std::optional<RawTag> read_tag(Source& source, int64_t position)
{
    std::array<uint8_t, tag_header_size + 1> header{};
    std::array<uint8_t, sizeof(uint32_t)> back_pointer{};
    if (!source.read_all(position, header.data(), header.size()))
        return std::nullopt;
    const uint32_t size = big_endian_24(&header[1]);
    const int64_t data_end = position + tag_header_size + size;
    const uint8_t type = header[0];
    if ((type != type_audio && type != type_video && type != type_script) || size == 0 ||
        !source.read_all(data_end, back_pointer.data(), back_pointer.size()))
        return std::nullopt;
    const uint32_t tag_size = uint32_t{back_pointer[0]} << 24 | big_endian_24(&back_pointer[1]);
    if (tag_size != tag_header_size + size)
        return std::nullopt;
    RawTag tag;
    if (type != type_script)
        tag.stream = type == type_video ? flvdmx::Stream::video : flvdmx::Stream::audio;
    tag.timestamp = big_endian_24(&header[4]) | uint32_t{header[7]} << 24;
    tag.codec_byte = header[tag_header_size];
    tag.end = data_end + static_cast<int64_t>(back_pointer.size());
    return tag;
}

bool is_before_restart(Source& source, int64_t position, const flvdmx::File& file)
{
    if (file.instance()->last_ts == 0) // any time is valid
        return false;
    std::optional<RawTag> tag;
    bool late = false;
    for (int i = 0; i < examined_tags && (tag = read_tag(source, position)); ++i, position = tag->end) {
        const bool follows_late = late;
        late = is_late(*tag, file);
        if (late && follows_late)
            return true;
    }
    return false;
}

std::string reason_to_skip(const RawTag& tag, const flvdmx::File& file, const flvdmx::Info& info)
{
    using namespace std::string_literals;
    if (tag.stream == flvdmx::Stream::any)
        return "";
    const bool video = tag.stream == flvdmx::Stream::video;
    const char* const codec = video ? flvdmx::name(tag.video_codec()) : flvdmx::name(tag.audio_codec());
    if (video && !info.video && tag.video_codec() == flvdmx::VideoCodec::avc)
        return "the video is not played: its first tags contain no usable AVC configuration";
    if (video ? !info.video : !info.audio)
        return (video ? "the video"s : "the audio"s) +
               " is not played: none was found among the first tags of the file (" + codec + ")";
    if (video && tag.video_codec() != info.video->codec)
        return "video is not played: its codec changes from "s + flvdmx::name(info.video->codec) + " to " + codec;
    if (!video && tag.audio_codec() != info.audio->codec)
        return "audio is not played: its codec changes from "s + flvdmx::name(info.audio->codec) + " to " + codec;
    if (!video && tag.codec_byte != (file.instance()->audio_format_filter & 0xFF))
        return "audio is not played: its sample rate, sample size or channels change";
    return "";
}

} // namespace flvdmx_gst
